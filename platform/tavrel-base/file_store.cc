// File labels in an extended attribute of the file itself, so that a label
// moves with the file and is seen by every process.
#include <cerrno>
#include <cstdio>
#include <fcntl.h>
#include <sys/types.h>
#include <sys/xattr.h>

#include "label_codec.hh"
#include "stores.hh"

namespace tavrel {
namespace {

// Runs a getxattr-style call `get(buffer, size)` into buf, growing it once
// the attribute's size is known.
template <class Get>
int read_attr(Get &&get, ByteBuf &buf, size_t *len) noexcept
{
	for (;;) {
		const ssize_t n = get(buf.data(), buf.capacity());
		if (n >= 0) {
			*len = static_cast<size_t>(n);
			return 0;
		}
		const int err = errno;
		if (err == ENODATA || err == ENOTSUP)
			return ENODATA;  // no label stored, or none storable: all zero
		if (err == E2BIG)
			return EIO;
		if (err != ERANGE)
			return err;
		// The buffer was too small: ask for the size, then try again (the
		// attribute may change in between, hence the loop).
		const ssize_t need = get(nullptr, 0);
		if (need < 0)
			return errno == ENODATA ? ENODATA : errno;
		if (static_cast<size_t>(need) > kMaxFormSize)
			return EIO;
		if (!buf.reserve(static_cast<size_t>(need)))
			return ENOMEM;
	}
}

int write_result(int rc) noexcept
{
	if (rc == 0)
		return 0;
	// The file system refuses a value that large; report it as no room.
	return errno == E2BIG ? ENOSPC : errno;
}

// /proc/self/fd/<fd>: reaches the file behind a descriptor that the f*xattr
// calls refuse (one opened with O_PATH).
struct FdPath {
	char text[32];
	explicit FdPath(int fd) noexcept { std::snprintf(text, sizeof text, "/proc/self/fd/%d", fd); }
};

bool is_open_fd(int fd) noexcept { return fcntl(fd, F_GETFD) != -1; }

} // namespace

int read_path_label(const Config &cfg, const char *path, bool follow, ByteBuf &buf, size_t *len) noexcept
{
	if (!path)
		return EFAULT;
	return read_attr([&](void *p, size_t n) {
		return follow ? getxattr(path, cfg.attr_name, p, n) : lgetxattr(path, cfg.attr_name, p, n);
	}, buf, len);
}

int write_path_label(const Config &cfg, const char *path, bool follow, const uint8_t *data, size_t len) noexcept
{
	if (!path)
		return EFAULT;
	return write_result(follow ? setxattr(path, cfg.attr_name, data, len, 0)
	                           : lsetxattr(path, cfg.attr_name, data, len, 0));
}

int read_fd_label(const Config &cfg, int fd, ByteBuf &buf, size_t *len) noexcept
{
	const int err = read_attr([&](void *p, size_t n) { return fgetxattr(fd, cfg.attr_name, p, n); }, buf, len);
	if (err != EBADF || !is_open_fd(fd))
		return err;
	const FdPath via(fd);
	return read_path_label(cfg, via.text, true, buf, len);
}

int write_fd_label(const Config &cfg, int fd, const uint8_t *data, size_t len) noexcept
{
	const int err = write_result(fsetxattr(fd, cfg.attr_name, data, len, 0));
	if (err != EBADF || !is_open_fd(fd))
		return err;
	const FdPath via(fd);
	return write_path_label(cfg, via.text, true, data, len);
}

} // namespace tavrel
