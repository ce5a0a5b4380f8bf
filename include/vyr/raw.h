/*
 * Raw label forms: portable, packed, little-endian byte strings of a
 * mandatory part, a role part and a whole label, for storing a label or
 * sending it elsewhere.
 *
 *   mandatory part (18 + blob_size bytes):
 *     version:2 type:2 lev:1 ilev:1 cat:8 blob_size:4 blob
 *   role part (11 + 13 * (nroles1 + nroles2) bytes):
 *     version:2 reserved:1 nroles1:4 nroles2:4 roles1 roles2
 *   whole label (26 + blob_size + 13 * (nroles1 + nroles2) bytes):
 *     version:2 type:2 lev:1 ilev:1 cat:8 blob_size:4 nroles1:4 nroles2:4
 *     blob roles1 roles2
 *   role entry (13 bytes): id:8 attr:4 rights:1
 *
 * version is always 1.  Writers return a buffer from malloc that the caller
 * frees.  Readers return new records (use count 1) that own copies of
 * everything and never read at or past `len`; they return NULL for a form
 * that is too short for its own sizes or has another version.
 */
#ifndef VYR_RAW_H
#define VYR_RAW_H

#include <vyr/common.h>
#include <vyr/types.h>

#include <stdint.h>

VYR_BEGIN_DECLS

/* Length of each form with no blob and no roles: 26, 18 and 11. */
extern const uint64_t VYRL_RAW_MIN_SIZE;
extern const uint64_t VYRLM_RAW_MIN_SIZE;
extern const uint64_t VYRRL_RAW_MIN_SIZE;

/* ---- sizes -------------------------------------------------------------- */

/* Length of the form that the writer would produce for a record. */
uint64_t vyrml_raw_size(const vyrml_t *ml) VYR_NOEXCEPT;
uint64_t vyrrl_raw_size(const vyrrl_t *rl) VYR_NOEXCEPT;
uint64_t vyrl_raw_size(const vyrl_t *l) VYR_NOEXCEPT;

/* Length of a stored form, from the sizes in its head.  Nothing is checked:
 * the caller must hold at least the form's minimum size. */
uint64_t vyrrawml_size(const void *bytes) VYR_NOEXCEPT;
uint64_t vyrrawrl_size(const void *bytes) VYR_NOEXCEPT;
uint64_t vyrrawl_size(const void *bytes) VYR_NOEXCEPT;

/* ---- writers -------------------------------------------------------------
 * Return a new buffer with the form, or NULL when memory runs out.  When
 * `size` is not NULL it receives the form's length (left alone on failure). */

uint8_t *vyrml_get_raw(const vyrml_t *ml, uint64_t *size) VYR_NOEXCEPT;
/* Both lists must have entries wherever their counts say so. */
uint8_t *vyrrl_get_raw(const vyrrl_t *rl, uint64_t *size) VYR_NOEXCEPT;
/* A list with a count but no entries is stored with its count and zero bytes
 * in place of its entries. */
uint8_t *vyrl_get_raw(const vyrl_t *l, uint64_t *size) VYR_NOEXCEPT;

/* ---- readers ------------------------------------------------------------ */

/* Reads a mandatory-part form.  When `consumed` is not NULL it receives
 * blob_size + 26: the offset of the role entries in a whole-label form with
 * the same blob, i.e. the `offset` that vyrrl_get_from_raw_lbl wants. */
vyrml_t *vyrml_get_from_raw(const void *bytes, uint64_t len, uint64_t *consumed) VYR_NOEXCEPT;
vyrrl_t *vyrrl_get_from_raw(const void *bytes, uint64_t len) VYR_NOEXCEPT;
vyrl_t *vyrl_get_from_raw(const void *bytes, uint64_t len) VYR_NOEXCEPT;
/* Reads the role part of a whole-label form: the counts from offsets 18 and
 * 22, the entries from `offset`.  The version is not checked. */
vyrrl_t *vyrrl_get_from_raw_lbl(const void *bytes, uint64_t len, uint64_t offset) VYR_NOEXCEPT;

/* ---- role entries ----------------------------------------------------------
 * Convert `n` entries between memory and the 13-byte form and advance the
 * cursor by 13 * n.  Nothing is checked: both sides must have room. */

void vyr_roles_to_raw(uint8_t **cursor, const vyr_role_t *roles, uint64_t n) VYR_NOEXCEPT;
void vyr_roles_from_raw(vyr_role_t *roles, uint64_t n, const uint8_t **cursor) VYR_NOEXCEPT;

VYR_END_DECLS

#endif /* VYR_RAW_H */
