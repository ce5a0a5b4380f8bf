/*
 * libvyr label core: label records and their lifetime, role lists, field
 * access and label algebra, equality and relations, permission decisions.
 *
 * Ownership in short: every constructor and copy hands the caller one
 * reference (use count 1) to each record it creates; drop it with the
 * matching *_put.  Role entries and role arrays that are returned on their
 * own have no use count and are released with free().
 *
 * This header compiles as C11 and as C++.
 */
#ifndef VYR_LABEL_H
#define VYR_LABEL_H

#include <vyr/common.h>
#include <vyr/types.h>

#include <stdint.h>

VYR_BEGIN_DECLS

/* ---- Named bits of the mandatory `type` word ------------------------- */

/* VYR_TYPE_CCNR (1), VYR_TYPE_CCNRI (2) and VYR_TYPE_EHOLE (4) come from
 * <vyr/types.h>.  ccnr lets a child hold a lower lev or fewer categories,
 * ccnri a lower ilev; ehole opens the object to every mandatory access. */
#define VYR_TYPE_CCNRA (VYR_TYPE_CCNR | VYR_TYPE_CCNRI)
#define VYR_TYPE_ALL   (VYR_TYPE_CCNR | VYR_TYPE_CCNRI | VYR_TYPE_EHOLE)

/* ---- Request word of the permission decisions ------------------------ */

#define VYR_REQ_EXEC     0x1
#define VYR_REQ_WRITE    0x2
#define VYR_REQ_READ     0x4
#define VYR_REQ_WRITE_UP 0x8
#define VYR_REQ_CHILD    0x10
#define VYR_REQ_OBJ_TYPE 0x8000
#define VYR_REQ_NO_LEV   0x10000
#define VYR_REQ_NO_CAT   0x20000
#define VYR_REQ_NO_ILEV  0x40000

/* ---- Static labels ---------------------------------------------------- */

/* All-zero label, and a label whose type is "ehole".  Both start with use
 * count 1 in each record; a caller may pair vyrl_get/vyrl_put on them but
 * must never drop that first reference. */
extern vyrl_t *const VYRL_ZERO;
extern vyrl_t *const VYRL_EQU;

/* ---- Constructors (NULL on allocation failure, nothing left behind) --- */

vyrml_t *vyrml_get_new(void) VYR_NOEXCEPT;
vyrrl_t *vyrrl_get_new(void) VYR_NOEXCEPT;
vyrl_t *vyrl_get_new(void) VYR_NOEXCEPT;
vyrml_t *vyrml_get_new_init(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type) VYR_NOEXCEPT;
/* Takes over the caller's reference on each part given; makes an empty part
 * for a NULL argument.  On failure the given parts stay the caller's. */
vyrl_t *vyrl_get_new_init_mr(vyrml_t *ml, vyrrl_t *rl) VYR_NOEXCEPT;
vyrl_t *vyrl_get_new_init_mac(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type) VYR_NOEXCEPT;

/* Role part with arrays of exactly these sizes, contents unset. */
vyrrl_t *vyrrl_get_new_alloc(uint32_t nroles1, uint32_t nroles2) VYR_NOEXCEPT;
/* Role part over normalised copies of the two arrays. */
vyrrl_t *vyrrl_get_new_init_roles(const vyr_role_t *roles1, uint32_t nroles1,
                                  const vyr_role_t *roles2, uint32_t nroles2) VYR_NOEXCEPT;
vyrl_t *vyrl_get_new_init_mac_roles(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type,
                                    const vyr_role_t *roles1, uint32_t nroles1,
                                    const vyr_role_t *roles2, uint32_t nroles2) VYR_NOEXCEPT;

/* ---- Use counts (no NULL tests) --------------------------------------- */

vyrl_t *vyrl_get(vyrl_t *l) VYR_NOEXCEPT;
vyrl_t *vyrlnc_get(vyrl_t *l) VYR_NOEXCEPT;
vyrml_t *vyrml_get(vyrml_t *m) VYR_NOEXCEPT;
vyrrl_t *vyrrl_get(vyrrl_t *r) VYR_NOEXCEPT;
void vyrl_put(vyrl_t *l) VYR_NOEXCEPT;
void vyrml_put(vyrml_t *m) VYR_NOEXCEPT;
void vyrrl_put(vyrrl_t *r) VYR_NOEXCEPT;
int64_t vyrl_ucnt(const vyrl_t *l) VYR_NOEXCEPT;
int64_t vyrml_ucnt(const vyrml_t *m) VYR_NOEXCEPT;
int64_t vyrrl_ucnt(const vyrrl_t *r) VYR_NOEXCEPT;

/* ---- Deep copies (share nothing with the source; NULL on failure) ----- */

vyrml_t *vyrml_dup(const vyrml_t *m) VYR_NOEXCEPT;
vyrrl_t *vyrrl_dup(const vyrrl_t *r) VYR_NOEXCEPT;
vyrl_t *vyrl_dup(const vyrl_t *l) VYR_NOEXCEPT;

/* Borrowed parts: no use count changes. */
vyrml_t *vyrl_ml(const vyrl_t *l) VYR_NOEXCEPT;
vyrrl_t *vyrl_rl(const vyrl_t *l) VYR_NOEXCEPT;

/* ---- Role entries and arrays ------------------------------------------ */

uint64_t vyr_roles_size(uint64_t n) VYR_NOEXCEPT;     /* 16 n: bytes in memory */
uint64_t vyr_roles_raw_size(uint64_t n) VYR_NOEXCEPT; /* 13 n: bytes in the raw form */
vyr_role_t *vyr_role_dup(const vyr_role_t *roles, uint32_t n) VYR_NOEXCEPT;
vyr_role_t *vyrr_get_new_init(uint64_t id, uint32_t attr, uint8_t rights) VYR_NOEXCEPT;
int vyrr_cpy(vyr_role_t *dst, const vyr_role_t *src, uint32_t n) VYR_NOEXCEPT;
int vyr_role_cmp(const vyr_role_t *a, const vyr_role_t *b) VYR_NOEXCEPT;
/* Strictly descending id, duplicates moved behind the lowered *count. */
void vyr_roles_normalize(vyr_role_t *roles, uint32_t *count) VYR_NOEXCEPT;
vyr_role_t *duplicate_role(const vyr_role_t *r) VYR_NOEXCEPT;
vyr_role_t *duplicate_mass_all_roles(const vyr_role_t *src, uint32_t n,
                                     vyr_role_t *old, uint32_t *count) VYR_NOEXCEPT;
vyr_role_t *duplicate_and_add_mass_all_roles(const vyr_role_t *add, uint32_t nadd,
                                             vyr_role_t *old, uint32_t *count) VYR_NOEXCEPT;
vyr_role_t *rback_only_new_role_add(const vyr_role_t *r, vyr_role_t *list, uint32_t *count) VYR_NOEXCEPT;

/* ---- Field access (no NULL tests, in place, shared parts see changes) - */

uint8_t vyrl_lev(const vyrl_t *l) VYR_NOEXCEPT;
uint8_t vyrml_lev(const vyrml_t *m) VYR_NOEXCEPT;
uint8_t vyrl_ilev(const vyrl_t *l) VYR_NOEXCEPT;
uint8_t vyrml_ilev(const vyrml_t *m) VYR_NOEXCEPT;
uint64_t vyrl_cat(const vyrl_t *l) VYR_NOEXCEPT;
uint64_t vyrml_cat(const vyrml_t *m) VYR_NOEXCEPT;
uint16_t vyrl_type(const vyrl_t *l) VYR_NOEXCEPT;
uint16_t vyrml_type(const vyrml_t *m) VYR_NOEXCEPT;

void vyrl_set_lev(vyrl_t *l, uint8_t v) VYR_NOEXCEPT;
void vyrml_set_lev(vyrml_t *m, uint8_t v) VYR_NOEXCEPT;
void vyrl_set_ilev(vyrl_t *l, uint8_t v) VYR_NOEXCEPT;
void vyrml_set_ilev(vyrml_t *m, uint8_t v) VYR_NOEXCEPT;
void vyrl_set_cat(vyrl_t *l, uint64_t v) VYR_NOEXCEPT;
void vyrml_set_cat(vyrml_t *m, uint64_t v) VYR_NOEXCEPT;
void vyrl_set_type(vyrl_t *l, uint16_t v) VYR_NOEXCEPT;
void vyrml_set_type(vyrml_t *m, uint16_t v) VYR_NOEXCEPT;

void vyrl_and_cat(vyrl_t *l, uint64_t v) VYR_NOEXCEPT;
void vyrml_and_cat(vyrml_t *m, uint64_t v) VYR_NOEXCEPT;
void vyrl_or_cat(vyrl_t *l, uint64_t v) VYR_NOEXCEPT;
void vyrml_or_cat(vyrml_t *m, uint64_t v) VYR_NOEXCEPT;
void vyrl_subtract_cat(vyrl_t *l, uint64_t v) VYR_NOEXCEPT;
void vyrl_and_type(vyrl_t *l, uint16_t v) VYR_NOEXCEPT;
void vyrml_and_type(vyrml_t *m, uint16_t v) VYR_NOEXCEPT;
void vyrl_or_type(vyrl_t *l, uint16_t v) VYR_NOEXCEPT;
void vyrml_or_type(vyrml_t *m, uint16_t v) VYR_NOEXCEPT;
void vyrl_subtract_type(vyrl_t *l, uint16_t v) VYR_NOEXCEPT;

void vyrl_maximize_lev(vyrl_t *l, uint8_t v) VYR_NOEXCEPT;
void vyrl_minimize_lev(vyrl_t *l, uint8_t v) VYR_NOEXCEPT;
void vyrl_maximize_ilev(vyrl_t *l, uint8_t v) VYR_NOEXCEPT;
void vyrl_minimize_ilev(vyrl_t *l, uint8_t v) VYR_NOEXCEPT;

uint8_t vyr_lev_max(uint8_t a, uint8_t b) VYR_NOEXCEPT;
uint8_t vyr_lev_min(uint8_t a, uint8_t b) VYR_NOEXCEPT;
uint8_t vyr_ilev_max(uint8_t a, uint8_t b) VYR_NOEXCEPT;
uint8_t vyr_ilev_min(uint8_t a, uint8_t b) VYR_NOEXCEPT;

/* Both return a; b is only read and may be a itself. */
vyrl_t *vyrl_unite(vyrl_t *a, const vyrl_t *b) VYR_NOEXCEPT;
vyrl_t *vyrl_subtract(vyrl_t *a, const vyrl_t *b) VYR_NOEXCEPT;

/* Replace *dst by a private copy of src; note the three result conventions:
 *   vyrl_upd:      self -> NULL + errno EINVAL, no memory -> NULL, ok -> new *dst
 *   vyrml_own_cpy: self -> 22, no memory -> 12, ok -> 0 (errno untouched)
 *   vyrrl_own_cpy: self -> 0 (no change), no memory -> -1, ok -> 0 */
vyrl_t *vyrl_upd(vyrl_t **dst, const vyrl_t *src) VYR_NOEXCEPT;
int vyrml_own_cpy(vyrml_t **dst, const vyrml_t *src) VYR_NOEXCEPT;
int vyrrl_own_cpy(vyrrl_t **dst, const vyrrl_t *src) VYR_NOEXCEPT;

/* ---- Equality (1 equal, 0 not) and relations (0 holds, -13 not) ------- */

int vyrml_cmp(const vyrml_t *a, const vyrml_t *b) VYR_NOEXCEPT;
int vyrrl_cmp(const vyrrl_t *a, const vyrrl_t *b, uint32_t unused) VYR_NOEXCEPT;
int vyrl_cmp(const vyrl_t *a, const vyrl_t *b, uint32_t unused) VYR_NOEXCEPT;
int vyrml_notg(const vyrml_t *a, const vyrml_t *b) VYR_NOEXCEPT;
int vyrl_notg(const vyrl_t *a, const vyrl_t *b) VYR_NOEXCEPT;
int vyrml_child_parent(const vyrml_t *child, const vyrml_t *parent) VYR_NOEXCEPT;
int vyr_child_parent(const vyrl_t *child, const vyrl_t *parent) VYR_NOEXCEPT;

/* ---- Permission decisions (0 permitted, -1 denied; subject first) ----- */

int vyr_lev_permission(int subject, int object, int request) VYR_NOEXCEPT;
int vyr_cat_permission(uint64_t subject, uint64_t object, int request) VYR_NOEXCEPT;
int vyr_ilev_permission(int subject, int object, int request) VYR_NOEXCEPT;
int vyrml_conf_permission(const vyrml_t *subject, const vyrml_t *object, int request) VYR_NOEXCEPT;
int vyrml_permission(const vyrml_t *subject, const vyrml_t *object, int request) VYR_NOEXCEPT;
int vyr_roles_permission(const vyr_role_t *subject, uint32_t n,
                         const vyr_role_t *object, uint32_t m, int request) VYR_NOEXCEPT;
int vyrrl_permission(const vyrrl_t *subject, const vyrrl_t *object, int request) VYR_NOEXCEPT;
int vyrl_permission(const vyrl_t *subject, const vyrl_t *object, int request) VYR_NOEXCEPT;

VYR_END_DECLS

#endif /* VYR_LABEL_H */
