/*
 * The label records.
 *
 * A label is a small tree of three reference-counted heap records: the whole
 * label vyrl_t points at a mandatory part vyrml_t and a role part vyrrl_t.
 * The kernel's label service reads and fills these records in place, so
 * their layout is an interface of its own: every offset and size below is
 * fixed, padding included, for 64-bit little-endian Linux.
 *
 * Ownership: each record carries its own use count, which starts at 1. A
 * vyrl_t owns one reference to each of its parts; a vyrml_t owns its blob and
 * a vyrrl_t its two role arrays, all from malloc and released with free.
 */
#ifndef VYR_TYPES_H
#define VYR_TYPES_H

#include <stddef.h>
#include <stdint.h>
#include <vyr/common.h>

VYR_BEGIN_DECLS

/* One role entry; a role list is a plain array of these, ordered by
 * strictly descending id. */
typedef struct vyr_role {
	uint64_t id;     /* role identifier */
	uint32_t attr;   /* attribute word: carried and compared, never interpreted */
	uint8_t rights;  /* right bits tested by the role decision */
	/* 3 bytes of padding */
} vyr_role_t;

/* The mandatory part of a label. */
typedef struct vyrml {
	uint8_t lev;          /* confidentiality level */
	uint8_t ilev;         /* integrity level */
	uint64_t cat;         /* category bit mask */
	uint16_t type;        /* flag word (VYR_TYPE_* bits) */
	uint32_t blob_size;   /* length of blob in bytes */
	unsigned char *blob;  /* blob_size bytes or NULL; owned */
	int32_t ucnt;         /* use count, changed atomically */
} vyrml_t;

/* The role part of a label. */
typedef struct vyrrl {
	uint32_t nroles1;     /* entries in roles1 */
	uint32_t nroles2;     /* entries in roles2 */
	vyr_role_t *roles1;   /* first role list or NULL; owned */
	vyr_role_t *roles2;   /* second role list or NULL; owned */
	int32_t ucnt;         /* use count, changed atomically */
} vyrrl_t;

/* A whole label. */
typedef struct vyrl {
	vyrml_t *ml;          /* mandatory part; one reference held */
	vyrrl_t *rl;          /* role part; one reference held */
	int32_t ucnt;         /* use count, changed atomically */
} vyrl_t;

/* Named bits of vyrml_t.type. All 16 bits are carried alike. */
#define VYR_TYPE_CCNR  0x1
#define VYR_TYPE_CCNRI 0x2
#define VYR_TYPE_EHOLE 0x4

VYR_STATIC_ASSERT(sizeof(vyr_role_t) == 16, "vyr_role_t is 16 bytes");
VYR_STATIC_ASSERT(offsetof(vyr_role_t, id) == 0, "vyr_role_t.id");
VYR_STATIC_ASSERT(offsetof(vyr_role_t, attr) == 8, "vyr_role_t.attr");
VYR_STATIC_ASSERT(offsetof(vyr_role_t, rights) == 12, "vyr_role_t.rights");

VYR_STATIC_ASSERT(sizeof(vyrml_t) == 40, "vyrml_t is 40 bytes");
VYR_STATIC_ASSERT(offsetof(vyrml_t, lev) == 0, "vyrml_t.lev");
VYR_STATIC_ASSERT(offsetof(vyrml_t, ilev) == 1, "vyrml_t.ilev");
VYR_STATIC_ASSERT(offsetof(vyrml_t, cat) == 8, "vyrml_t.cat");
VYR_STATIC_ASSERT(offsetof(vyrml_t, type) == 16, "vyrml_t.type");
VYR_STATIC_ASSERT(offsetof(vyrml_t, blob_size) == 20, "vyrml_t.blob_size");
VYR_STATIC_ASSERT(offsetof(vyrml_t, blob) == 24, "vyrml_t.blob");
VYR_STATIC_ASSERT(offsetof(vyrml_t, ucnt) == 32, "vyrml_t.ucnt");

VYR_STATIC_ASSERT(sizeof(vyrrl_t) == 32, "vyrrl_t is 32 bytes");
VYR_STATIC_ASSERT(offsetof(vyrrl_t, nroles1) == 0, "vyrrl_t.nroles1");
VYR_STATIC_ASSERT(offsetof(vyrrl_t, nroles2) == 4, "vyrrl_t.nroles2");
VYR_STATIC_ASSERT(offsetof(vyrrl_t, roles1) == 8, "vyrrl_t.roles1");
VYR_STATIC_ASSERT(offsetof(vyrrl_t, roles2) == 16, "vyrrl_t.roles2");
VYR_STATIC_ASSERT(offsetof(vyrrl_t, ucnt) == 24, "vyrrl_t.ucnt");

VYR_STATIC_ASSERT(sizeof(vyrl_t) == 24, "vyrl_t is 24 bytes");
VYR_STATIC_ASSERT(offsetof(vyrl_t, ml) == 0, "vyrl_t.ml");
VYR_STATIC_ASSERT(offsetof(vyrl_t, rl) == 8, "vyrl_t.rl");
VYR_STATIC_ASSERT(offsetof(vyrl_t, ucnt) == 16, "vyrl_t.ucnt");

VYR_END_DECLS

#endif /* VYR_TYPES_H */
