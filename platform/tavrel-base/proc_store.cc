// Process labels: one record file per labelled process in the state
// directory, named "<pid>.<start time>" with the start time (in clock ticks
// since boot) from /proc/<pid>/stat.  A pid that the system hands out again
// belongs to a process with another start time, so it never finds the record
// of the process that had it before.
//
// A process without a record has the label of its nearest ancestor that has
// one, as if the label had been copied at fork; with none, the all-zero
// label.  Records are replaced atomically: written to a temporary file in
// the same directory, then renamed over the old one.
#include <cerrno>
#include <cinttypes>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "label_codec.hh"
#include "stores.hh"

namespace tavrel {
namespace {

// Bound on the ancestor walk; pid chains are far shorter, but a table that
// changes under us must not keep us walking.
constexpr int kMaxAncestors = 1 << 16;

// Closes a descriptor on scope exit.
struct Fd {
	int fd = -1;
	explicit Fd(int f) noexcept : fd(f) {}
	Fd(const Fd &) = delete;
	Fd &operator=(const Fd &) = delete;
	~Fd()
	{
		if (fd >= 0)
			close(fd);
	}
};

struct ProcInfo {
	int64_t ppid = 0;
	uint64_t start = 0;
};

// Resolves the pid of a command: 0 is the caller; outside 1..INT_MAX no
// process can have it.
bool resolve_pid(int64_t pid, int64_t *out) noexcept
{
	if (pid == 0) {
		*out = getpid();
		return true;
	}
	if (pid < 0 || pid > INT_MAX)
		return false;
	*out = pid;
	return true;
}

// Reads a whole small file into text (NUL-terminated): its length, or -1
// with errno set.
ssize_t read_small_file(const char *path, char *text, size_t size) noexcept
{
	Fd f(open(path, O_RDONLY | O_CLOEXEC));
	if (f.fd < 0)
		return -1;
	size_t used = 0;
	while (used + 1 < size) {
		const ssize_t n = read(f.fd, text + used, size - 1 - used);
		if (n < 0) {
			if (errno == EINTR)
				continue;
			return -1;
		}
		if (n == 0)
			break;
		used += static_cast<size_t>(n);
	}
	text[used] = '\0';
	return static_cast<ssize_t>(used);
}

// Parent and start time of a process, from /proc/<pid>/stat.  The command
// name (field 2) may hold spaces and parentheses, so fields are counted from
// the last ')': state is field 3, ppid field 4, starttime field 22.
int proc_info(int64_t pid, ProcInfo *out) noexcept
{
	char path[64];
	std::snprintf(path, sizeof path, "/proc/%" PRId64 "/stat", pid);
	char text[1024];
	if (read_small_file(path, text, sizeof text) < 0)
		return errno == ENOENT ? ESRCH : errno;
	const char *p = std::strrchr(text, ')');
	if (!p)
		return EIO;
	++p;
	ProcInfo info;
	for (int field = 3; field <= 22; ++field) {
		while (*p == ' ')
			++p;
		if (!*p)
			return EIO;
		char *end = nullptr;
		if (field == 4)
			info.ppid = std::strtoll(p, &end, 10);
		else if (field == 22)
			info.start = std::strtoull(p, &end, 10);
		p = std::strchr(p, ' ');
		if (!p && field < 22)
			return EIO;
		if (!p)
			break;
	}
	*out = info;
	return 0;
}

// File name of a record within the state directory.
struct RecordName {
	char text[64];
	RecordName(int64_t pid, uint64_t start) noexcept
	{
		std::snprintf(text, sizeof text, "%" PRId64 ".%" PRIu64, pid, start);
	}
};

// Reads one record: 0, ENOENT when the process has none, or an errno value.
int read_record(int dir_fd, const char *name, ByteBuf &buf, size_t *len) noexcept
{
	Fd f(openat(dir_fd, name, O_RDONLY | O_CLOEXEC | O_NOFOLLOW));
	if (f.fd < 0)
		return errno;
	struct stat st;
	if (fstat(f.fd, &st) != 0)
		return errno;
	if (!S_ISREG(st.st_mode) || static_cast<uint64_t>(st.st_size) > kMaxFormSize)
		return EIO;
	const size_t size = static_cast<size_t>(st.st_size);
	if (!buf.reserve(size))
		return ENOMEM;
	size_t used = 0;
	while (used < size) {
		const ssize_t n = read(f.fd, buf.data() + used, size - used);
		if (n < 0 && errno == EINTR)
			continue;
		if (n < 0)
			return errno;
		if (n == 0)
			return EIO;  // shrank under us: records are only ever replaced whole
		used += static_cast<size_t>(n);
	}
	*len = size;
	return 0;
}

// Creates the state directory and any missing parents.
int make_dirs(const char *dir) noexcept
{
	char path[PATH_MAX];
	const size_t n = std::strlen(dir);
	if (n >= sizeof path)
		return ENAMETOOLONG;
	std::memcpy(path, dir, n + 1);
	for (size_t i = 1; i <= n; ++i) {
		if (path[i] != '/' && path[i] != '\0')
			continue;
		const char saved = path[i];
		path[i] = '\0';
		if (mkdir(path, 0755) != 0 && errno != EEXIST)
			return errno;
		path[i] = saved;
	}
	return 0;
}

int write_all(int fd, const uint8_t *data, size_t len) noexcept
{
	while (len > 0) {
		const ssize_t n = write(fd, data, len);
		if (n < 0 && errno == EINTR)
			continue;
		if (n < 0)
			return errno;
		data += n;
		len -= static_cast<size_t>(n);
	}
	return 0;
}

// Writes a record under a temporary name and renames it into place, so a
// reader sees the old record or the new one, never a part.
int replace_record(const Config &cfg, const char *name, const uint8_t *data, size_t len) noexcept
{
	char final_path[PATH_MAX];
	if (std::snprintf(final_path, sizeof final_path, "%s/%s", cfg.state_dir, name) >= static_cast<int>(sizeof final_path))
		return ENAMETOOLONG;
	if (int err = make_dirs(cfg.state_dir))
		return err;
	char tmp[PATH_MAX];
	if (std::snprintf(tmp, sizeof tmp, "%s/.new.XXXXXX", cfg.state_dir) >= static_cast<int>(sizeof tmp))
		return ENAMETOOLONG;
	Fd f(mkostemp(tmp, O_CLOEXEC));
	if (f.fd < 0)
		return errno;
	int err = write_all(f.fd, data, len);
	if (!err && fchmod(f.fd, 0644) != 0)
		err = errno;
	if (!err && rename(tmp, final_path) != 0)
		err = errno;
	if (err)
		unlink(tmp);
	return err;
}

} // namespace

int read_pid_label(const Config &cfg, int64_t pid, ByteBuf &buf, size_t *len) noexcept
{
	int64_t self;
	if (!resolve_pid(pid, &self))
		return ESRCH;
	ProcInfo info;
	if (int err = proc_info(self, &info))
		return err;
	Fd dir(open(cfg.state_dir, O_RDONLY | O_DIRECTORY | O_CLOEXEC));
	if (dir.fd < 0)
		return errno == ENOENT ? ENODATA : errno;  // no directory yet: no records at all
	for (int hop = 0; hop < kMaxAncestors; ++hop) {
		const int err = read_record(dir.fd, RecordName(self, info.start).text, buf, len);
		if (err != ENOENT)
			return err;
		if (info.ppid <= 0)
			break;
		self = info.ppid;
		if (proc_info(self, &info) != 0)
			break;  // the ancestor is gone: no label to inherit from it
	}
	return ENODATA;
}

int write_pid_label(const Config &cfg, int64_t pid, const uint8_t *data, size_t len) noexcept
{
	int64_t self;
	if (!resolve_pid(pid, &self))
		return ESRCH;
	ProcInfo info;
	if (int err = proc_info(self, &info))
		return err;
	return replace_record(cfg, RecordName(self, info.start).text, data, len);
}

} // namespace tavrel
