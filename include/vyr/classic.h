/*
 * The classic label interface: the small value mac_t, its text form, its
 * permission test, its flat 24-byte form, and the older kernel calls that read
 * and set levels and categories of paths, descriptors and processes.
 *
 * A mac_t comes from malloc, has exactly one owner and no use count; release
 * it with mac_free.  Strings returned here come from malloc and are released
 * with free.  The accessors accept NULL (getters give 0, setters -1).
 *
 * The kernel calls fetch the whole label through the kernel label calls,
 * change level, categories and the "ehole" flag in place, and write the label
 * back, so that the integrity level, the other flags, the byte string and the
 * role lists survive every call.
 */
#ifndef VYR_CLASSIC_H
#define VYR_CLASSIC_H

#include <vyr/common.h>

#include <stddef.h>
#include <stdint.h>
#include <wchar.h>


VYR_BEGIN_DECLS

/* ---- the value ---------------------------------------------------------- */

/* The classic label value, 24 bytes. */
typedef struct mac {
    uint32_t type_low; /* low 8 bits of `type`, kept in step with it     */
    uint8_t lev;       /* level                                           */
    uint64_t cat;      /* category mask                                   */
    uint32_t type;     /* type word: class and waiver bits, see below     */
} mac_t;

/* Zones of the type word. */
#define MAC_TYPE_WAIVERS   0xffu    /* waiver bits                        */
#define MAC_TYPE_CLASS     0xf0000u /* class: 0 subject, 0x10000 object   */
#define MAC_CLASS_SUBJECT  0x0u
#define MAC_CLASS_OBJECT   0x10000u

/* Waiver bits: an object holding one is exempt from that test. */
#define MAC_WAIVE_CAT_READ  0x01u
#define MAC_WAIVE_CAT_WRITE 0x02u
#define MAC_WAIVE_CAT_EXEC  0x04u
#define MAC_WAIVE_LEV_READ  0x08u
#define MAC_WAIVE_LEV_WRITE 0x10u
#define MAC_WAIVE_LEV_EXEC  0x20u

/* Named type words. */
#define MAC_TYPE_SUBJECT 0x0u
#define MAC_TYPE_OBJECT  0x10000u
#define MAC_TYPE_LOW     0x1002du /* waives read and execute, not write */
#define MAC_TYPE_EQU     0x1003fu /* waives everything                  */
#define MAC_TYPE_EQU_W   0x10012u /* waives write only                  */

/* Request bits of mac_permit; other bits are ignored. */
#define MAC_REQ_READ  4u
#define MAC_REQ_WRITE 2u
#define MAC_REQ_EXEC  1u

/* Size of the flat form written by mac_copy_ext. */
#define MAC_EXT_SIZE 24

mac_t *mac_init(uint32_t type) VYR_NOEXCEPT;
mac_t *mac_dup(const mac_t *m) VYR_NOEXCEPT;
void mac_free(mac_t *m) VYR_NOEXCEPT;
/* 0, or -1 with errno EINVAL for NULL or a non-object holding waiver bits. */
int mac_valid(const mac_t *m) VYR_NOEXCEPT;

int mac_set_lev(mac_t *m, unsigned int lev) VYR_NOEXCEPT; /* low 8 bits are stored */
int mac_set_cat(mac_t *m, uint64_t cat) VYR_NOEXCEPT;
/* Refuses (EINVAL) waiver bits on a value of class 0. */
int mac_set_type(mac_t *m, uint32_t type) VYR_NOEXCEPT;
uint8_t mac_get_lev(const mac_t *m) VYR_NOEXCEPT;
uint64_t mac_get_cat(const mac_t *m) VYR_NOEXCEPT;
uint32_t mac_get_type(const mac_t *m) VYR_NOEXCEPT;

/* Copies level and categories; the type word only when both classes agree. */
int mac_copy(mac_t *dst, const mac_t *src) VYR_NOEXCEPT;
/* 0 equal (or both NULL), 1 a dominates b, -1 b dominates a, -2 neither. */
int mac_cmp(const mac_t *a, const mac_t *b) VYR_NOEXCEPT;
/* 0 permitted, -1 denied (or EINVAL for a NULL value). */
int mac_permit(const mac_t *subject, const mac_t *object, uint32_t request) VYR_NOEXCEPT;
int mac_file_permit(const mac_t *subject, const mac_t *object, uint32_t request) VYR_NOEXCEPT;
/* 0 if NULL or level, categories and waiver bits are all 0, else -1. */
int mac_empty(const mac_t *m) VYR_NOEXCEPT;
int64_t mac_size(const mac_t *m) VYR_NOEXCEPT;
/* Writes the 24-byte flat form; 24, or -1 with EINVAL (NULL buffer) or
 * ERANGE (size below 24, nothing written). */
int64_t mac_copy_ext(void *buf, const mac_t *m, uint64_t size) VYR_NOEXCEPT;
/* Reads a flat form of 24 bytes; NULL with EINVAL for a bad magic word. */
mac_t *mac_copy_int(const void *buf) VYR_NOEXCEPT;

/* ---- text form ------------------------------------------------------------
 * Up to three fields joined by ":": level, categories, type.  With none of
 * the field bits set, level and categories are written, and the type too for
 * an object that holds waiver bits. */

#define MAC_TEXT_NAMES 1 /* names instead of numbers, for every field */
#define MAC_TEXT_LEV   2
#define MAC_TEXT_CAT   4
#define MAC_TEXT_TYPE  8

char *mac_to_text(const mac_t *m, size_t *len, int flags) VYR_NOEXCEPT;
wchar_t *mac_to_wtext(const mac_t *m, size_t *len, int flags) VYR_NOEXCEPT;
/* 0, or -1 (EINVAL for a text that does not read); on failure the value is
 * unchanged.  A NULL text changes nothing and succeeds. */
int mac_from_text(mac_t *m, const char *text) VYR_NOEXCEPT;

/* ---- kernel calls ------------------------------------------------------- */

/* Level and categories of a process. */
typedef struct tavrel_mac {
    uint8_t lev;
    uint64_t cat;
} tavrel_mac_t;

/* Label of a file: waiver bits and level and categories.  The kernel keeps
 * all six waivers as one flag, so only 63 (all of them) survives a round
 * trip through it. */
typedef struct tavrel_mac_label {
    uint32_t type_low;
    tavrel_mac_t mac;
} tavrel_mac_label_t;

#define TAVREL_MAC_ALL_WAIVERS 63u

int tavrel_chmac(const char *path, const tavrel_mac_label_t *label) VYR_NOEXCEPT;
int tavrel_fchmac(int fd, const tavrel_mac_label_t *label) VYR_NOEXCEPT;
int tavrel_statmac(const char *path, tavrel_mac_label_t *label) VYR_NOEXCEPT;
int tavrel_fstatmac(int fd, tavrel_mac_label_t *label) VYR_NOEXCEPT;
int tavrel_setmac(int pid, const tavrel_mac_t *mac) VYR_NOEXCEPT;
int tavrel_getmac(int pid, tavrel_mac_t *mac) VYR_NOEXCEPT;
/* Level 0, categories 0, all waivers; 0 or -1. */
int tavrel_chmac_ign(const char *path) VYR_NOEXCEPT;
int tavrel_fchmac_ign(int fd) VYR_NOEXCEPT;

mac_t *mac_get_pid(int pid) VYR_NOEXCEPT;
int mac_set_pid(int pid, const mac_t *m) VYR_NOEXCEPT;
mac_t *mac_get_file(const char *path) VYR_NOEXCEPT;
mac_t *mac_get_fd(int fd) VYR_NOEXCEPT;
int mac_set_file(const char *path, const mac_t *m) VYR_NOEXCEPT;
int mac_set_fd(int fd, const mac_t *m) VYR_NOEXCEPT;

/* ---- conversions (no kernel call) --------------------------------------- */

mac_t *tavrel_mac_t_to_mac_t(const tavrel_mac_t *mac, uint32_t type) VYR_NOEXCEPT;
void mac_t_to_tavrel_mac_t(const mac_t *m, tavrel_mac_t *mac) VYR_NOEXCEPT;
mac_t *tavrel_mac_label_t_to_mac_t(const tavrel_mac_label_t *label) VYR_NOEXCEPT;
void mac_t_to_tavrel_mac_label_t(const mac_t *m, tavrel_mac_label_t *label) VYR_NOEXCEPT;
char *tavrel_mac_t_to_text(const tavrel_mac_t *mac, uint32_t type, int flags) VYR_NOEXCEPT;
char *tavrel_mac_label_t_to_text(const tavrel_mac_label_t *label, int flags) VYR_NOEXCEPT;
int tavrel_mac_t_from_text(tavrel_mac_t *mac, const char *text) VYR_NOEXCEPT;
int tavrel_mac_label_t_from_text(tavrel_mac_label_t *label, const char *text) VYR_NOEXCEPT;

/* ---- layout ------------------------------------------------------------- */

VYR_STATIC_ASSERT(sizeof(mac_t) == 24, "mac_t is 24 bytes");
VYR_STATIC_ASSERT(offsetof(mac_t, type_low) == 0, "mac_t.type_low");
VYR_STATIC_ASSERT(offsetof(mac_t, lev) == 4, "mac_t.lev");
VYR_STATIC_ASSERT(offsetof(mac_t, cat) == 8, "mac_t.cat");
VYR_STATIC_ASSERT(offsetof(mac_t, type) == 16, "mac_t.type");
VYR_STATIC_ASSERT(sizeof(tavrel_mac_t) == 16, "tavrel_mac_t is 16 bytes");
VYR_STATIC_ASSERT(offsetof(tavrel_mac_t, lev) == 0, "tavrel_mac_t.lev");
VYR_STATIC_ASSERT(offsetof(tavrel_mac_t, cat) == 8, "tavrel_mac_t.cat");
VYR_STATIC_ASSERT(sizeof(tavrel_mac_label_t) == 24, "tavrel_mac_label_t is 24 bytes");
VYR_STATIC_ASSERT(offsetof(tavrel_mac_label_t, type_low) == 0, "tavrel_mac_label_t.type_low");
VYR_STATIC_ASSERT(offsetof(tavrel_mac_label_t, mac) == 8, "tavrel_mac_label_t.mac");

VYR_END_DECLS

#endif /* VYR_CLASSIC_H */
