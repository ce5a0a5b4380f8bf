/*
 * Name databases: the user label database (mac), the level database (lev)
 * and the category database (cat).
 *
 * Each database is served by a back-end plug-in that is loaded on first use.
 * Entry records come from malloc/calloc; whoever receives one owns it and
 * releases it with the matching free*ent_r function (or wcfree*ent for the
 * wide forms). A database handle is an opaque pointer-sized value that only
 * the plug-in reads.
 *
 * Families:
 *   parse_* / compose_* / fget*ent_r / fput*ent_r / free*ent_r
 *       entry records and their one-line text form; no plug-in involved.
 *   open*db_r ... rm*_r
 *       the handle-based interface, forwarded to the plug-in.
 *   set*ent, get*ent, get*nam ... (no suffix)
 *       one hidden handle per database and static results; not thread-safe.
 *   wc*
 *       the handle-based interface with wide-character names.
 */
#ifndef VYR_NAMEDB_H
#define VYR_NAMEDB_H

#include <vyr/common.h>

#include <stddef.h>
#include <stdint.h>
#include <stdio.h>
#include <wchar.h>


VYR_BEGIN_DECLS

/* ---- entry records (binary layout is part of the plug-in interface) ---- */

/* One user of the user label database: 40 bytes. */
typedef struct macent {
	char *name;     /*  0: user name, its own malloc block            */
	uint8_t lev1;   /*  8: first level; bytes 9..15 are padding       */
	uint64_t cat1;  /* 16: first category mask                        */
	uint8_t lev2;   /* 24: second level; bytes 25..31 are padding     */
	uint64_t cat2;  /* 32: second category mask                       */
} macent_t;

/* One level: 16 bytes. */
typedef struct levent {
	char *name;     /*  0: level name, its own malloc block           */
	uint8_t value;  /*  8: level value; bytes 9..15 are padding       */
} levent_t;

/* One category: 16 bytes. */
typedef struct catent {
	char *name;     /*  0: category name, its own malloc block        */
	uint64_t value; /*  8: category mask                              */
} catent_t;

/* Wide twins: the same shape, with `name` a wide string. */
typedef struct wcmacent {
	wchar_t *name;
	uint8_t lev1;
	uint64_t cat1;
	uint8_t lev2;
	uint64_t cat2;
} wcmacent_t;

typedef struct wclevent {
	wchar_t *name;
	uint8_t value;
} wclevent_t;

typedef struct wccatent {
	wchar_t *name;
	uint64_t value;
} wccatent_t;

VYR_STATIC_ASSERT(sizeof(void *) == 8, "64-bit target expected");
VYR_STATIC_ASSERT(sizeof(macent_t) == 40, "macent_t size");
VYR_STATIC_ASSERT(offsetof(macent_t, name) == 0, "macent_t.name");
VYR_STATIC_ASSERT(offsetof(macent_t, lev1) == 8, "macent_t.lev1");
VYR_STATIC_ASSERT(offsetof(macent_t, cat1) == 16, "macent_t.cat1");
VYR_STATIC_ASSERT(offsetof(macent_t, lev2) == 24, "macent_t.lev2");
VYR_STATIC_ASSERT(offsetof(macent_t, cat2) == 32, "macent_t.cat2");
VYR_STATIC_ASSERT(sizeof(levent_t) == 16, "levent_t size");
VYR_STATIC_ASSERT(offsetof(levent_t, name) == 0, "levent_t.name");
VYR_STATIC_ASSERT(offsetof(levent_t, value) == 8, "levent_t.value");
VYR_STATIC_ASSERT(sizeof(catent_t) == 16, "catent_t size");
VYR_STATIC_ASSERT(offsetof(catent_t, name) == 0, "catent_t.name");
VYR_STATIC_ASSERT(offsetof(catent_t, value) == 8, "catent_t.value");
VYR_STATIC_ASSERT(sizeof(wcmacent_t) == sizeof(macent_t), "wcmacent_t size");
VYR_STATIC_ASSERT(offsetof(wcmacent_t, lev1) == 8, "wcmacent_t.lev1");
VYR_STATIC_ASSERT(offsetof(wcmacent_t, cat1) == 16, "wcmacent_t.cat1");
VYR_STATIC_ASSERT(offsetof(wcmacent_t, lev2) == 24, "wcmacent_t.lev2");
VYR_STATIC_ASSERT(offsetof(wcmacent_t, cat2) == 32, "wcmacent_t.cat2");
VYR_STATIC_ASSERT(sizeof(wclevent_t) == sizeof(levent_t), "wclevent_t size");
VYR_STATIC_ASSERT(offsetof(wclevent_t, value) == 8, "wclevent_t.value");
VYR_STATIC_ASSERT(sizeof(wccatent_t) == sizeof(catent_t), "wccatent_t size");
VYR_STATIC_ASSERT(offsetof(wccatent_t, value) == 8, "wccatent_t.value");

/* ---- records and line formats: "%s:%d:%s:%d:%s", "%s:%d", "%s:%s" ---- */

macent_t *parse_mac(const char *line, macent_t *ent) VYR_NOEXCEPT;
levent_t *parse_lev(const char *line, levent_t *ent) VYR_NOEXCEPT;
catent_t *parse_cat(const char *line, catent_t *ent) VYR_NOEXCEPT;

char *compose_mac(const macent_t *ent) VYR_NOEXCEPT;
char *compose_lev(const levent_t *ent) VYR_NOEXCEPT;
char *compose_cat(const catent_t *ent) VYR_NOEXCEPT;

macent_t *fgetmacent_r(FILE *fp) VYR_NOEXCEPT;
levent_t *fgetlevent_r(FILE *fp) VYR_NOEXCEPT;
catent_t *fgetcatent_r(FILE *fp) VYR_NOEXCEPT;

int fputmacent_r(FILE *fp, const macent_t *ent) VYR_NOEXCEPT;
int fputlevent_r(FILE *fp, const levent_t *ent) VYR_NOEXCEPT;
int fputcatent_r(FILE *fp, const catent_t *ent) VYR_NOEXCEPT;

void freemacent_r(macent_t *ent) VYR_NOEXCEPT;
void freelevent_r(levent_t *ent) VYR_NOEXCEPT;
void freecatent_r(catent_t *ent) VYR_NOEXCEPT;

/* ---- handle-based interface ---- */

void *openmacdb_r(void) VYR_NOEXCEPT;
int closemacdb_r(void *db) VYR_NOEXCEPT;
int setmacent_r(void *db) VYR_NOEXCEPT;
int endmacent_r(void *db) VYR_NOEXCEPT;
macent_t *getmacent_r(void *db) VYR_NOEXCEPT;
macent_t *getmacnam_r(void *db, const char *name) VYR_NOEXCEPT;
macent_t *getmacuid_r(void *db, uint32_t uid) VYR_NOEXCEPT;
int putmacent_r(void *db, const macent_t *ent) VYR_NOEXCEPT;
int rmmacnam_r(void *db, const char *name) VYR_NOEXCEPT;

/* The plug-in's per-user hooks; `arg` is passed through untouched. */
int getlchuid(uint32_t uid, void *arg) VYR_NOEXCEPT;
int getlchnam(const char *name, void *arg) VYR_NOEXCEPT;
int setlchuid(uint32_t uid, void *arg) VYR_NOEXCEPT;
int setlchnam(const char *name, void *arg) VYR_NOEXCEPT;

void *openlevdb_r(void) VYR_NOEXCEPT;
int closelevdb_r(void *db) VYR_NOEXCEPT;
int setlevent_r(void *db) VYR_NOEXCEPT;
int endlevent_r(void *db) VYR_NOEXCEPT;
levent_t *getlevent_r(void *db) VYR_NOEXCEPT;
levent_t *getlevnam_r(void *db, const char *name) VYR_NOEXCEPT;
levent_t *getlevval_r(void *db, int value) VYR_NOEXCEPT;      /* low 8 bits used */
int putlevent_r(void *db, const levent_t *ent) VYR_NOEXCEPT;
int rmlevnam_r(void *db, const char *name) VYR_NOEXCEPT;
int rmlevval_r(void *db, int value) VYR_NOEXCEPT;             /* low 8 bits used */
/* 0: level known, 1: unknown, -1: open/close failed. `db` may be NULL. */
int levexstval(void *db, int value) VYR_NOEXCEPT;

void *opencatdb_r(void) VYR_NOEXCEPT;
int closecatdb_r(void *db) VYR_NOEXCEPT;
int setcatent_r(void *db) VYR_NOEXCEPT;
int endcatent_r(void *db) VYR_NOEXCEPT;
catent_t *getcatent_r(void *db) VYR_NOEXCEPT;
catent_t *getcatnam_r(void *db, const char *name) VYR_NOEXCEPT;
catent_t *getcatval_r(void *db, uint64_t value) VYR_NOEXCEPT;
int putcatent_r(void *db, const catent_t *ent) VYR_NOEXCEPT;  /* value must be one bit */
int rmcatnam_r(void *db, const char *name) VYR_NOEXCEPT;
int rmcatval_r(void *db, uint64_t value) VYR_NOEXCEPT;
/* 0: every bit of `mask` known, 1: some bit unknown, -1: open/close failed. */
int is_cats_valid(void *db, uint64_t mask) VYR_NOEXCEPT;

/* ---- static-result interface (one hidden handle per database) ---- */

int setmacent(void) VYR_NOEXCEPT;
int endmacent(void) VYR_NOEXCEPT;
macent_t *getmacent(void) VYR_NOEXCEPT;
macent_t *fgetmacent(FILE *fp) VYR_NOEXCEPT;
macent_t *getmacnam(const char *name) VYR_NOEXCEPT;
macent_t *getmacuid(uint32_t uid) VYR_NOEXCEPT;
int putmacent(const macent_t *ent) VYR_NOEXCEPT;
int rmmacnam(const char *name) VYR_NOEXCEPT;
int fputmacent(FILE *fp, const macent_t *ent) VYR_NOEXCEPT;

int setlevent(void) VYR_NOEXCEPT;
int endlevent(void) VYR_NOEXCEPT;
levent_t *getlevent(void) VYR_NOEXCEPT;
levent_t *fgetlevent(FILE *fp) VYR_NOEXCEPT;
levent_t *getlevnam(const char *name) VYR_NOEXCEPT;
levent_t *getlevval(int value) VYR_NOEXCEPT;
int putlevent(const levent_t *ent) VYR_NOEXCEPT;
int rmlevnam(const char *name) VYR_NOEXCEPT;
int rmlevval(int value) VYR_NOEXCEPT;
int fputlevent(FILE *fp, const levent_t *ent) VYR_NOEXCEPT;

int setcatent(void) VYR_NOEXCEPT;
int endcatent(void) VYR_NOEXCEPT;
catent_t *getcatent(void) VYR_NOEXCEPT;
catent_t *fgetcatent(FILE *fp) VYR_NOEXCEPT;
catent_t *getcatnam(const char *name) VYR_NOEXCEPT;
catent_t *getcatval(uint64_t value) VYR_NOEXCEPT;
int putcatent(const catent_t *ent) VYR_NOEXCEPT;
int rmcatnam(const char *name) VYR_NOEXCEPT;
int rmcatval(uint64_t value) VYR_NOEXCEPT;
int fputcatent(FILE *fp, const catent_t *ent) VYR_NOEXCEPT;

/* ---- wide-character interface ---- */

int wcsetmacent(void *db) VYR_NOEXCEPT;
int wcendmacent(void *db) VYR_NOEXCEPT;
wcmacent_t *wcgetmacent(void *db) VYR_NOEXCEPT;
wcmacent_t *wcfgetmacent(FILE *fp) VYR_NOEXCEPT;
wcmacent_t *wcgetmacuid(void *db, uint32_t uid) VYR_NOEXCEPT;
wcmacent_t *wcgetmacnam(void *db, const wchar_t *name) VYR_NOEXCEPT;
int wcrmmacnam(void *db, const wchar_t *name) VYR_NOEXCEPT;
int wcputmacent(void *db, const wcmacent_t *ent) VYR_NOEXCEPT;
int wcfputmacent(FILE *fp, const wcmacent_t *ent) VYR_NOEXCEPT;
int wcfreemacent(wcmacent_t *ent) VYR_NOEXCEPT;

int wcsetlevent(void *db) VYR_NOEXCEPT;
int wcendlevent(void *db) VYR_NOEXCEPT;
wclevent_t *wcgetlevent(void *db) VYR_NOEXCEPT;
wclevent_t *wcfgetlevent(FILE *fp) VYR_NOEXCEPT;
wclevent_t *wcgetlevval(void *db, int value) VYR_NOEXCEPT;
wclevent_t *wcgetlevnam(void *db, const wchar_t *name) VYR_NOEXCEPT;
int wcrmlevnam(void *db, const wchar_t *name) VYR_NOEXCEPT;
int wcrmlevval(void *db, int value) VYR_NOEXCEPT;
int wcputlevent(void *db, const wclevent_t *ent) VYR_NOEXCEPT;
int wcfputlevent(FILE *fp, const wclevent_t *ent) VYR_NOEXCEPT;
int wcfreelevent(wclevent_t *ent) VYR_NOEXCEPT;

int wcsetcatent(void *db) VYR_NOEXCEPT;
int wcendcatent(void *db) VYR_NOEXCEPT;
wccatent_t *wcgetcatent(void *db) VYR_NOEXCEPT;
wccatent_t *wcfgetcatent(FILE *fp) VYR_NOEXCEPT;
wccatent_t *wcgetcatval(void *db, uint64_t value) VYR_NOEXCEPT;
wccatent_t *wcgetcatnam(void *db, const wchar_t *name) VYR_NOEXCEPT;
int wcrmcatnam(void *db, const wchar_t *name) VYR_NOEXCEPT;
int wcrmcatval(void *db, uint64_t value) VYR_NOEXCEPT;
int wcputcatent(void *db, const wccatent_t *ent) VYR_NOEXCEPT;
int wcfputcatent(FILE *fp, const wccatent_t *ent) VYR_NOEXCEPT;
int wcfreecatent(wccatent_t *ent) VYR_NOEXCEPT;

VYR_END_DECLS

#endif /* VYR_NAMEDB_H */
