// Kernel label calls: the one road from the library to the label service.
//
// Every command goes through the service library's three functions.  The
// channel is opened before each command (the open is cheap on an open
// channel), so nothing needs to be set up first and vyr_release only closes
// it until the next call.

#include <vyr/kernel.h>
#include <vyr/label.h>

#include "contract/tavrel_base.h"

#include <cerrno>
#include <cstdint>
#include <cstdlib>

namespace vyr::kernel {
namespace {

// A command target: the address of a path text, or a descriptor or process
// number that goes to the service widened with its sign.
vyr_label_cmd_t command(const char *path, vyrl_t *label) noexcept {
    vyr_label_cmd_t cmd{};
    cmd.target.path = path;
    cmd.label = label;
    return cmd;
}

vyr_label_cmd_t command(int num, vyrl_t *label) noexcept {
    vyr_label_cmd_t cmd{};
    cmd.target.num = int64_t{num};
    cmd.label = label;
    return cmd;
}

template <class Target>
int set_label(int cmd_no, Target target, vyrl_t *label) noexcept {
    vyr_label_cmd_t cmd = command(target, label);
    if (tavrel_open() < 0) return -1;
    return tavrel_syscall_ioctl(cmd_no, &cmd);
}

// Replaces *buf by a new buffer of `bytes` bytes when `count` is not 0,
// releasing the buffer of an earlier pass.  On failure *buf is NULL (the old
// buffer is gone too) and false is returned.
template <class T>
bool regrow(T *&buf, uint64_t count, uint64_t bytes) noexcept {
    if (count == 0) return true;
    std::free(buf);
    buf = static_cast<T *>(std::malloc(bytes));
    return buf != nullptr;
}

// Gives the label the room that the service asked for in its sizes.
bool grow(vyrl_t *label) noexcept {
    vyrml_t *ml = label->ml;
    vyrrl_t *rl = label->rl;
    return regrow(ml->blob, ml->blob_size, ml->blob_size) &&
           regrow(rl->roles1, rl->nroles1, vyr_roles_size(rl->nroles1)) &&
           regrow(rl->roles2, rl->nroles2, vyr_roles_size(rl->nroles2));
}

// Offers the label to the service until it fits.  The service answers E2BIG
// with the sizes it needs; the loop has no limit of its own and ends on the
// first answer that is not E2BIG.  A label without blob and roles takes one
// pass, a larger one two, and one that grew in between one more each time.
template <class Target>
vyrl_t *get_label(int cmd_no, Target target) noexcept {
    vyrl_t *label = vyrl_get_new();
    if (label == nullptr) return nullptr;
    for (;;) {
        vyr_label_cmd_t cmd = command(target, label);
        if (tavrel_open() >= 0 && tavrel_syscall_ioctl(cmd_no, &cmd) == 0) return label;
        if (errno != E2BIG || !grow(label)) {
            // The caller sees the errno of the failing call or allocation.
            const int saved = errno;
            vyrl_put(label);
            errno = saved;
            return nullptr;
        }
    }
}

// Stamps a target with the label of "/" under a new type word.  The label
// read is private to this call, so changing it affects nobody else.
template <class Setter, class Target>
int set_sys_max(Setter set, Target target, uint16_t type, bool clear_ilev) noexcept {
    vyrl_t *label = vyr_get_path("/");
    if (label == nullptr) return -1;
    vyrl_set_type(label, type);
    if (clear_ilev) vyrl_set_ilev(label, 0);
    const int rc = set(target, label);
    vyrl_put(label);
    return rc;
}

}  // namespace
}  // namespace vyr::kernel

using namespace vyr::kernel;

extern "C" {

int vyr_init(void) noexcept { return tavrel_open() < 0 ? 1 : 0; }

int vyr_release(void) noexcept { return tavrel_close(); }

int vyr_set_path(const char *path, vyrl_t *label) noexcept {
    return set_label(TAVREL_CMD_SET_PATH, path, label);
}

int vyr_set_lpath(const char *path, vyrl_t *label) noexcept {
    return set_label(TAVREL_CMD_SET_LPATH, path, label);
}

int vyr_set_fd(int fd, vyrl_t *label) noexcept { return set_label(TAVREL_CMD_SET_FD, fd, label); }

int vyr_set_pid(int pid, vyrl_t *label) noexcept { return set_label(TAVREL_CMD_SET_PID, pid, label); }

vyrl_t *vyr_get_path(const char *path) noexcept { return get_label(TAVREL_CMD_GET_PATH, path); }

vyrl_t *vyr_get_lpath(const char *path) noexcept { return get_label(TAVREL_CMD_GET_LPATH, path); }

vyrl_t *vyr_get_fd(int fd) noexcept { return get_label(TAVREL_CMD_GET_FD, fd); }

vyrl_t *vyr_get_pid(int pid) noexcept { return get_label(TAVREL_CMD_GET_PID, pid); }

int vyr_set_sys_max_path(const char *path) noexcept {
    return set_sys_max(vyr_set_path, path, VYR_TYPE_ALL, false);
}

int vyr_set_sys_max_ccnr_path(const char *path) noexcept {
    return set_sys_max(vyr_set_path, path, VYR_TYPE_CCNR, true);
}

int vyr_set_sys_max_fd(int fd) noexcept { return set_sys_max(vyr_set_fd, fd, VYR_TYPE_ALL, false); }

}  // extern "C"
