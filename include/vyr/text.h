/*
 * Label text: writing labels and their fields as text, and reading them back.
 *
 * Writers append to a caller's obstack (glibc <obstack.h>) and return the
 * number of bytes appended, or -1.  The *_get_text and *_asprintf forms
 * return a new NUL-terminated string from malloc that the caller frees, or
 * NULL.  Level and category names come from the level and category name
 * databases; the words "Low", "High", "No" and ":No" are looked up with
 * dcgettext in the domain "vyr" each time they are written.
 */
#ifndef VYR_TEXT_H
#define VYR_TEXT_H

#include <vyr/common.h>
#include <vyr/types.h>

#include <stdint.h>

/* Exported functions never throw; C++ callers see that in their type. */
struct obstack;

VYR_BEGIN_DECLS

/* ---- text flag word ---------------------------------------------------- */

/* Write numbers, never names; no name database is opened. */
#define VYR_TEXT_NUMERIC    1
/* A value that has no name is an error instead of being written as a number. */
#define VYR_TEXT_NAMED_ONLY 32
/* Level 0 and empty role lists are left out (separators stay). */
#define VYR_TEXT_OMIT_ZERO  64

/* ---- writers ------------------------------------------------------------ */

/* Single fields.  Each returns the bytes appended, or -1. */
int vyr_lev_obstack(uint8_t lev, struct obstack *o, int flags) VYR_NOEXCEPT;
int vyr_ilev_obstack(uint8_t ilev, struct obstack *o, int flags) VYR_NOEXCEPT;
int vyr_cat_obstack(uint64_t cat, struct obstack *o, int flags) VYR_NOEXCEPT;
int vyr_type_obstack(uint16_t type, struct obstack *o, int flags) VYR_NOEXCEPT;

/* Single fields as new strings, or NULL.
 * vyr_lev_get_text and vyr_ilev_get_text differ from their obstack writers:
 * a value that has a name is always given by name (VYR_TEXT_NUMERIC is not
 * looked at); a level without a name gives NULL for flags 0 and its number
 * for any other flag word; an integrity level above 1 gives NULL with
 * VYR_TEXT_NAMED_ONLY, else its number. */
char *vyr_lev_get_text(uint8_t lev, int flags) VYR_NOEXCEPT;
char *vyr_ilev_get_text(uint8_t ilev, int flags) VYR_NOEXCEPT;
char *vyr_cat_get_text(uint64_t cat, int flags) VYR_NOEXCEPT;
char *vyr_type_get_text(uint16_t type, int flags) VYR_NOEXCEPT;

/* Whole records: "lev:ilev:cat:type", "roles1:roles2" and "mandatory!roles". */
int vyrml_obstack(const vyrml_t *ml, struct obstack *o, int flags) VYR_NOEXCEPT;
int vyrrl_obstack(const vyrrl_t *rl, struct obstack *o, int flags) VYR_NOEXCEPT;
int vyrl_obstack(const vyrl_t *l, struct obstack *o, int flags) VYR_NOEXCEPT;
char *vyrml_get_text(const vyrml_t *ml, int flags) VYR_NOEXCEPT;
char *vyrrl_get_text(const vyrrl_t *rl, int flags) VYR_NOEXCEPT;
char *vyrl_get_text(const vyrl_t *l, int flags) VYR_NOEXCEPT;

/*
 * Label format strings.  A directive is '%' [-] [0...][digits] then either
 * 'F' (takes one int argument: the stored flag word for later directives) or
 * any run of the flag letters N (numeric), R (named only), Z (omit zero),
 * G (merge the stored flag word), followed by a conversion letter:
 *   l level, i integrity level, c categories, t type,
 *   m mandatory part, r role part, % a literal '%'.
 * An unknown conversion letter writes nothing.  "%NN" ends at the second N.
 * The only arguments read are the ints for 'F'.
 * A format for a vyrml_ function must not use 'r'; one for a vyrrl_ function
 * must not use l, i, c, t or m.
 */
int vyrml_obstack_printf(const vyrml_t *ml, struct obstack *o, const char *fmt, ...) VYR_NOEXCEPT;
int vyrrl_obstack_printf(const vyrrl_t *rl, struct obstack *o, const char *fmt, ...) VYR_NOEXCEPT;
int vyrl_obstack_printf(const vyrl_t *l, struct obstack *o, const char *fmt, ...) VYR_NOEXCEPT;

/* As the *_obstack_printf functions, on a private obstack; they return the
 * resulting string itself (not a count), or NULL. */
char *vyrml_asprintf(const vyrml_t *ml, const char *fmt, ...) VYR_NOEXCEPT;
char *vyrrl_asprintf(const vyrrl_t *rl, const char *fmt, ...) VYR_NOEXCEPT;
char *vyrl_asprintf(const vyrl_t *l, const char *fmt, ...) VYR_NOEXCEPT;

/* Finishes the object being built on o, returns a NUL-terminated malloc'd
 * copy of it (NULL if that copy fails) and frees the whole obstack either way. */
char *vyr_obstack_finish(struct obstack *o) VYR_NOEXCEPT;

/* ---- readers ---- */

/*
 * Reading label text back.  The readers accept what the writers produce and
 * more: names and numbers are both taken for levels and categories (a name
 * wins over a number that reads the same), absent trailing fields are 0, and
 * a NULL or empty text reads as the all-zero label.
 *
 * Numbers are read leniently: a level or role id stops at the first
 * character that is not a digit ("12abc" is 12) and keeps only its low bits
 * ("300" is level 44, "-1" is level 255); category and type tokens are
 * hexadecimal with an optional "0x".
 *
 * The *_nc forms work in place: they write NUL bytes over separators of the
 * caller's (writable) text, which is cut into pieces afterwards, also after a
 * failure.  The other forms never change the text.
 *
 * int results are 0 on success and -1 on failure.  Records are new, with use
 * count 1 in every record, and share nothing with any other label; NULL is
 * failure.  errno is set by these readers only where noted.
 */

/* Level by name from the level database, else a decimal number. */
int vyr_lev_from_text(const char *text, uint8_t *lev) VYR_NOEXCEPT;
/* "Low" / "High" (plain or translated) or a decimal number; a text that is
 * none of these gives -1 with errno EINVAL. */
int vyr_ilev_from_text(const char *text, uint8_t *ilev) VYR_NOEXCEPT;
/* Comma list of category names and hexadecimal numbers, ORed together; a
 * number too large for 64 bits fails with errno ERANGE.  After a failure
 * *cat holds the bits of the tokens before the bad one. */
int vyr_cat_from_text(const char *text, uint64_t *cat) VYR_NOEXCEPT;
/* The same on the caller's text: the comma behind each token becomes NUL. */
int vyr_cat_from_text_nc(char *text, uint64_t *cat) VYR_NOEXCEPT;
/* Comma list of type names (ORed) and hexadecimal numbers; a number replaces
 * everything read before it, so "ccnr,10" is 0x10 while "10,ccnr" is 0x11. */
int vyr_type_from_text(const char *text, uint16_t *type) VYR_NOEXCEPT;
/* One role id in decimal; "No" (plain or translated) or an empty text clears
 * the role.  attr and rights are always cleared.  Unchanged on failure. */
int vyr_role_from_text(vyr_role_t *role, const char *text) VYR_NOEXCEPT;
/* Comma list of role ids into a new calloc'd array (normalised: descending,
 * no duplicate ids; the array may be longer than *count).  Every comma of
 * the text becomes NUL.  NULL, empty or "No" give *list NULL and *count 0.
 * On failure neither *list nor *count is written. */
int vyr_roles_from_text(char *text, vyr_role_t **list, uint32_t *count) VYR_NOEXCEPT;

/* "lev:ilev:cat:type", trailing fields optional. */
vyrml_t *vyrml_get_from_text(const char *text) VYR_NOEXCEPT;
/* In place: up to three ':' become NUL. */
vyrml_t *vyrml_get_from_text_nc(char *text) VYR_NOEXCEPT;
/* "roles1:roles2", the second list optional. */
vyrrl_t *vyrrl_get_from_text(const char *text) VYR_NOEXCEPT;
/* In place: the first ':' and every ',' become NUL. */
vyrrl_t *vyrrl_get_from_text_nc(char *text) VYR_NOEXCEPT;
/* "mandatory!roles", the role text optional. */
vyrl_t *vyrl_get_from_text(const char *text) VYR_NOEXCEPT;
/* In place: the first '!' and what the two readers above cut. */
vyrl_t *vyrl_get_from_text_nc(char *text) VYR_NOEXCEPT;

VYR_END_DECLS

#endif /* VYR_TEXT_H */
