// The exported channel: tavrel_open, tavrel_close and tavrel_syscall_ioctl.
//
// A get command reads the stored form of its target, decodes it completely
// and only then fills the caller's records, so a corrupt store never leaves
// a half-filled label behind.  A set command checks and encodes the caller's
// label before it stores anything and never writes to the caller's records.
#include <cerrno>

#include "contract/tavrel_base.h"

#include "byte_buf.hh"
#include "channel.hh"
#include "label_codec.hh"
#include "stores.hh"

namespace tavrel {
namespace {

enum class Kind { Path, LinkPath, Fd, Pid };

struct Command {
	Kind kind;
	bool set;
};

// The command table; false for a number that is no label command.
bool decode_command(int cmd, Command *out) noexcept
{
	switch (cmd) {
	case TAVREL_CMD_SET_PID: *out = {Kind::Pid, true}; return true;
	case TAVREL_CMD_GET_PID: *out = {Kind::Pid, false}; return true;
	case TAVREL_CMD_SET_FD: *out = {Kind::Fd, true}; return true;
	case TAVREL_CMD_GET_FD: *out = {Kind::Fd, false}; return true;
	case TAVREL_CMD_SET_PATH: *out = {Kind::Path, true}; return true;
	case TAVREL_CMD_GET_PATH: *out = {Kind::Path, false}; return true;
	case TAVREL_CMD_SET_LPATH: *out = {Kind::LinkPath, true}; return true;
	case TAVREL_CMD_GET_LPATH: *out = {Kind::LinkPath, false}; return true;
	default: return false;
	}
}

// Descriptor numbers arrive widened to 64 bits; one that no int can hold is
// no descriptor.
int as_fd(int64_t num) noexcept
{
	return (num < 0 || num > INT32_MAX) ? -1 : static_cast<int>(num);
}

int read_target(const Config &cfg, Kind kind, const vyr_label_cmd_t &arg, ByteBuf &buf, size_t *len) noexcept
{
	switch (kind) {
	case Kind::Path: return read_path_label(cfg, arg.target.path, true, buf, len);
	case Kind::LinkPath: return read_path_label(cfg, arg.target.path, false, buf, len);
	case Kind::Fd: return read_fd_label(cfg, as_fd(arg.target.num), buf, len);
	case Kind::Pid: return read_pid_label(cfg, arg.target.num, buf, len);
	}
	return EINVAL;
}

int write_target(const Config &cfg, Kind kind, const vyr_label_cmd_t &arg, const uint8_t *data, size_t len) noexcept
{
	switch (kind) {
	case Kind::Path: return write_path_label(cfg, arg.target.path, true, data, len);
	case Kind::LinkPath: return write_path_label(cfg, arg.target.path, false, data, len);
	case Kind::Fd: return write_fd_label(cfg, as_fd(arg.target.num), data, len);
	case Kind::Pid: return write_pid_label(cfg, arg.target.num, data, len);
	}
	return EINVAL;
}

int get_label(const Config &cfg, Kind kind, const vyr_label_cmd_t &arg) noexcept
{
	const vyrl_t *label = arg.label;
	if (!label || !label->ml || !label->rl)
		return EFAULT;
	ByteBuf buf;
	size_t len = 0;
	StoredLabel stored;
	int err = read_target(cfg, kind, arg, buf, &len);
	if (err == ENODATA)
		stored = kZeroLabel;
	else if (err)
		return err;
	else if ((err = decode_label(buf.data(), len, &stored)))
		return err;
	return fill_label(stored, arg.label);
}

int set_label(const Config &cfg, Kind kind, const vyr_label_cmd_t &arg) noexcept
{
	if (int err = check_label(arg.label))
		return err;
	ByteBuf buf;
	const size_t len = encoded_size(arg.label);
	if (!buf.reserve(len))
		return ENOMEM;
	encode_label(arg.label, buf.data());
	return write_target(cfg, kind, arg, buf.data(), len);
}

int run_command(int cmd, const vyr_label_cmd_t *arg) noexcept
{
	const Config *cfg = channel_config();
	if (!cfg)
		return EBADF;
	Command c;
	if (!decode_command(cmd, &c))
		return EINVAL;
	if (!arg)
		return EFAULT;
	return c.set ? set_label(*cfg, c.kind, *arg) : get_label(*cfg, c.kind, *arg);
}

} // namespace
} // namespace tavrel

extern "C" {

int tavrel_open(void) noexcept
{
	return tavrel::channel_open();
}

int tavrel_close(void) noexcept
{
	tavrel::channel_close();
	return 0;
}

int tavrel_syscall_ioctl(int cmd, vyr_label_cmd_t *arg) noexcept
{
	if (int err = tavrel::run_command(cmd, arg)) {
		errno = err;
		return -1;
	}
	return 0;
}

} // extern "C"
