/*
 * libtavrel-base.so.2: the channel to the kernel's label service.  Plain C
 * declarations, usable from C11 and C++.
 *
 * The service reads and fills the label records of <vyr/types.h> in place,
 * through the label pointer of the 16-byte argument record below.
 */
#ifndef VYR_CONTRACT_TAVREL_BASE_H
#define VYR_CONTRACT_TAVREL_BASE_H

#include <stddef.h>
#include <stdint.h>

#include <vyr/types.h>

/* The functions throw nothing; C++ callers see that in their type. */
#ifndef TAVREL_NOEXCEPT
#ifdef __cplusplus
#define TAVREL_NOEXCEPT noexcept
#else
#define TAVREL_NOEXCEPT
#endif
#endif

#ifdef __cplusplus
extern "C" {
#endif

/* Command numbers, the first argument of tavrel_syscall_ioctl. */
enum {
    TAVREL_CMD_SET_PID = 19,   /* 0x13 */
    TAVREL_CMD_GET_PID = 20,   /* 0x14 */
    TAVREL_CMD_SET_FD = 21,    /* 0x15 */
    TAVREL_CMD_SET_PATH = 22,  /* 0x16, follows a final symbolic link */
    TAVREL_CMD_GET_FD = 23,    /* 0x17 */
    TAVREL_CMD_GET_PATH = 24,  /* 0x18, follows a final symbolic link */
    TAVREL_CMD_SET_LPATH = 32, /* 0x20, acts on a symbolic link itself */
    TAVREL_CMD_GET_LPATH = 33  /* 0x21, acts on a symbolic link itself */
};

#ifndef VYR_LABEL_CMD_T_DEFINED
#define VYR_LABEL_CMD_T_DEFINED
/* Argument record of every label command, 16 bytes.  `target` holds the path
 * text for the path commands, else the descriptor or process number widened
 * with its sign to 64 bits. */
typedef struct vyr_label_cmd {
    union {
        const char *path;
        int64_t num;
    } target;       /* offset 0 */
    vyrl_t *label;  /* offset 8: the label read from (set) or filled (get) */
} vyr_label_cmd_t;

#endif /* VYR_LABEL_CMD_T_DEFINED */

VYR_STATIC_ASSERT(sizeof(vyr_label_cmd_t) == 16, "vyr_label_cmd_t is 16 bytes");
VYR_STATIC_ASSERT(offsetof(vyr_label_cmd_t, target) == 0, "vyr_label_cmd_t.target");
VYR_STATIC_ASSERT(offsetof(vyr_label_cmd_t, label) == 8, "vyr_label_cmd_t.label");

/* Opens the channel.  Returns 0 or more on success (calling it again on an
 * open channel is cheap and succeeds), a negative value with errno set on
 * failure. */
int tavrel_open(void) TAVREL_NOEXCEPT;

/* Ends what tavrel_open began.  Returns 0. */
int tavrel_close(void) TAVREL_NOEXCEPT;

/* Carries out `cmd` on `arg`.  Returns 0 on success, -1 with errno set on
 * failure.  On a get command whose label does not fit the room offered in
 * blob_size / nroles1 / nroles2, the sizes needed are written back into the
 * label and errno is E2BIG; E2BIG means that and nothing else. */
int tavrel_syscall_ioctl(int cmd, vyr_label_cmd_t *arg) TAVREL_NOEXCEPT;

#ifdef __cplusplus
}
#endif

#endif /* VYR_CONTRACT_TAVREL_BASE_H */
