/*
 * libtavrel-aux.so.2: the auxiliary platform library that libvyr calls for
 * charset conversion, number formatting, user records, wide strings, byte
 * order and unaligned word access.  Plain C declarations, usable from C11 and
 * C++.  Everything returned by pointer comes from malloc and is released with
 * free.
 */
#ifndef VYR_CONTRACT_TAVREL_AUX_H
#define VYR_CONTRACT_TAVREL_AUX_H

#include <iconv.h>
#include <pwd.h>
#include <stddef.h>
#include <stdint.h>
#include <wchar.h>

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

/* Converts the NUL-terminated string `in` through the open descriptor `cd`
 * and returns a new NUL-terminated string, or NULL (errno set) on failure.
 * The descriptor stays open and its shift state is reset before use; `in`
 * is not modified. */
char *zenk_encode(iconv_t cd, const char *in) TAVREL_NOEXCEPT;

/* Size of the buffer that zenk_u64tostr writes into. */
#define ZENK_U64TOSTR_BUFSIZE 30

/* Writes `value` in `base` (2..36, lower-case digits, no prefix) as
 * NUL-terminated text into `buf`, which holds ZENK_U64TOSTR_BUFSIZE bytes.
 * Returns `buf`.  Returns NULL with errno EINVAL, leaving `buf` untouched, for
 * a base outside 2..36 or for digits that would not fit in the buffer (only
 * possible in bases below 5). */
char *zenk_u64tostr(char *buf, uint64_t value, unsigned int base) TAVREL_NOEXCEPT;

/* printf into `buf` of `size` bytes, cut to fit and always NUL-terminated
 * when size > 0.  Returns the number of characters stored (NUL not counted),
 * never the length that would have been needed: 0 when size is 0 or on an
 * output error. */
int zenk_scnprintf(char *buf, size_t size, const char *fmt, ...) TAVREL_NOEXCEPT
#if defined(__GNUC__)
    __attribute__((format(printf, 3, 4)))
#endif
    ;

/* A user's password-database record in one heap block: a struct passwd
 * (whose first member, pw_name, points to the user's name) followed by the
 * strings it points to.  One free releases all of it.  NULL on failure, with
 * errno ENOENT when there is no such user, else what the lookup left. */
struct passwd *zenk_getpwnam(const char *name) TAVREL_NOEXCEPT;
struct passwd *zenk_getpwuid(uint32_t uid) TAVREL_NOEXCEPT;

/* Locale-encoded string -> new wide string, and back.  NULL with errno set
 * (EILSEQ for an unconvertible sequence, ENOMEM) on failure. */
wchar_t *zenk_string_towc(const char *s) TAVREL_NOEXCEPT;
char *zenk_string_fromwc(const wchar_t *ws) TAVREL_NOEXCEPT;

/* Byte order: host <-> little-endian. */
uint16_t zenk_cputole16(uint16_t v) TAVREL_NOEXCEPT;
uint32_t zenk_cputole32(uint32_t v) TAVREL_NOEXCEPT;
uint64_t zenk_cputole64(uint64_t v) TAVREL_NOEXCEPT;
uint16_t zenk_le16tocpu(uint16_t v) TAVREL_NOEXCEPT;
uint32_t zenk_le32tocpu(uint32_t v) TAVREL_NOEXCEPT;
uint64_t zenk_le64tocpu(uint64_t v) TAVREL_NOEXCEPT;

/* Word access at any alignment, touching exactly the word's bytes.  The
 * multi-byte words are stored big-endian (network order); the getters read
 * back what the setter of the same width stored. */
void zenk_set_w8(void *p, uint8_t v) TAVREL_NOEXCEPT;
void zenk_set_w16(void *p, uint16_t v) TAVREL_NOEXCEPT;
void zenk_set_w32(void *p, uint32_t v) TAVREL_NOEXCEPT;
void zenk_set_w64(void *p, uint64_t v) TAVREL_NOEXCEPT;
uint8_t zenk_get_w8(const void *p) TAVREL_NOEXCEPT;
uint16_t zenk_get_w16(const void *p) TAVREL_NOEXCEPT;
uint32_t zenk_get_w32(const void *p) TAVREL_NOEXCEPT;
uint64_t zenk_get_w64(const void *p) TAVREL_NOEXCEPT;

#ifdef __cplusplus
}
#endif

#endif /* VYR_CONTRACT_TAVREL_AUX_H */
