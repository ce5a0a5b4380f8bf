/*
 * Kernel label calls: reading and setting the labels of paths, descriptors
 * and processes through the kernel's label service.
 *
 * Every call opens the service channel itself before each command, so no
 * set-up call is needed.  Getters return a new label holding one reference
 * for the caller (drop it with vyrl_put), or NULL with errno set.  Setters
 * return 0, -1 when the channel cannot be opened, or the command's own
 * non-zero result; the caller's label and its use counts are left as they
 * were.
 */
#ifndef VYR_KERNEL_H
#define VYR_KERNEL_H

#include <vyr/common.h>
#include <vyr/types.h>

#include <stddef.h>
#include <stdint.h>

VYR_BEGIN_DECLS

/* ---- the wire interface of the label service ---------------------------- */

/* Command numbers, the first argument of tavrel_syscall_ioctl. */
#define VYR_CMD_SET_PID   19
#define VYR_CMD_GET_PID   20
#define VYR_CMD_SET_FD    21
#define VYR_CMD_SET_PATH  22
#define VYR_CMD_GET_FD    23
#define VYR_CMD_GET_PATH  24
#define VYR_CMD_SET_LPATH 32
#define VYR_CMD_GET_LPATH 33

/* The 16-byte argument record of every label command.  `target` is the
 * address of the path text for the path commands, or the descriptor or
 * process number widened with its sign to 64 bits.  `label` is read by the
 * set commands and filled in place by the get commands: on a get, the sizes
 * in the label state the room offered, and a label that does not fit makes
 * the command fail with E2BIG after the service has written the sizes it
 * needs. */
#ifndef VYR_LABEL_CMD_T_DEFINED
#define VYR_LABEL_CMD_T_DEFINED
typedef struct vyr_label_cmd {
    union {
        const char *path;
        int64_t num;
    } target;       /* offset 0 */
    vyrl_t *label;  /* offset 8 */
} vyr_label_cmd_t;
VYR_STATIC_ASSERT(sizeof(vyr_label_cmd_t) == 16, "vyr_label_cmd_t is 16 bytes");
VYR_STATIC_ASSERT(offsetof(vyr_label_cmd_t, target) == 0, "vyr_label_cmd_t.target");
VYR_STATIC_ASSERT(offsetof(vyr_label_cmd_t, label) == 8, "vyr_label_cmd_t.label");
#endif

/* ---- channel ------------------------------------------------------------ */

/* Opens the service channel: 0 on success, 1 (not -1) on failure. */
int vyr_init(void) VYR_NOEXCEPT;
/* Closes the channel; returns what the service library's close returned.
 * The next call opens it again. */
int vyr_release(void) VYR_NOEXCEPT;

/* ---- setters ------------------------------------------------------------ */

int vyr_set_path(const char *path, vyrl_t *label) VYR_NOEXCEPT;
/* As vyr_set_path, for the link itself rather than what it points to. */
int vyr_set_lpath(const char *path, vyrl_t *label) VYR_NOEXCEPT;
int vyr_set_fd(int fd, vyrl_t *label) VYR_NOEXCEPT;
int vyr_set_pid(int pid, vyrl_t *label) VYR_NOEXCEPT;

/* ---- getters ------------------------------------------------------------ */

vyrl_t *vyr_get_path(const char *path) VYR_NOEXCEPT;
vyrl_t *vyr_get_lpath(const char *path) VYR_NOEXCEPT;
vyrl_t *vyr_get_fd(int fd) VYR_NOEXCEPT;
vyrl_t *vyr_get_pid(int pid) VYR_NOEXCEPT;

/* ---- system maximum labels -------------------------------------------------
 * Each reads the label of "/", changes its type word (and for the ccnr form
 * also clears the integrity level) and writes it to the target.  -1 when the
 * label of "/" cannot be read; otherwise the setter's result. */

/* type 7, integrity level of "/" */
int vyr_set_sys_max_path(const char *path) VYR_NOEXCEPT;
/* type 1, integrity level 0 */
int vyr_set_sys_max_ccnr_path(const char *path) VYR_NOEXCEPT;
/* type 7, integrity level of "/" */
int vyr_set_sys_max_fd(int fd) VYR_NOEXCEPT;

VYR_END_DECLS

#endif /* VYR_KERNEL_H */
