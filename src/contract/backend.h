/*
 * Back-end plug-ins of the name databases, as libvyr sees them.
 *
 * A plug-in is a shared object named
 *     libtavrel-mac-db-<backend>.so.2        (VYR_BACKEND_FILE_FMT)
 * that libvyr dlopen()s by that bare file name with RTLD_NOW. The <backend>
 * part is the back-end name configured for a database in dbroute_cfg; the
 * word "mac" and the version 2 are the same for all three databases, so
 * databases that name the same back-end share one file.
 *
 * Each entry is looked up as "<backend>_<slot>" (VYR_BACKEND_SYMBOL_FMT).
 * A missing entry is not an error: only the function behind it fails
 * (ENOSYS, or EOPNOTSUPP for the two lch hooks).
 *
 * Contract of the entries:
 *  - open*db_r returns an opaque handle, or NULL with errno set. libvyr never
 *    looks at a handle and forwards NULL handles like any other.
 *  - close*db_r returns 0 on success.
 *  - set*ent_r returns 0 (or more) on success, negative on failure; after it
 *    the next get*ent_r on that handle yields the first entry.
 *  - get*ent_r returns the next entry, NULL at the end or on failure.
 *  - Every record returned is a separate malloc/calloc block, and so is its
 *    `name`, which must not be NULL. libvyr may free `name` and store another
 *    malloc'd string in its place; callers release records with free(). A
 *    record outlives the handle that produced it.
 *  - getmacnam_r / getmacuid_r that find nothing set errno to ENOENT or
 *    ENODATA (the caller may then build a default entry).
 *  - getlevval_r / getcatval_r that fail with EILSEQ declare that the value
 *    exists even though no record is returned.
 *  - Names passed in are valid only for the duration of the call and are in
 *    the back-end's configured charset.
 *  - put*ent_r receives a record that may be NULL or have a NULL name; the
 *    plug-in decides what to do with it. The record belongs to the caller.
 *  - getlevval_r / rmlevval_r get a level in 0..255; getcatval_r and
 *    rmcatval_r get any 64-bit value (zero and multi-bit included).
 *  - do_getlch / do_setlch receive a user record from zenk_getpwnam or
 *    zenk_getpwuid (first word: pointer to the user name; owned by libvyr)
 *    and the caller's pointer-sized argument.
 *
 * Plain C declarations; compiles as C11 and as C++.
 */
#ifndef VYR_CONTRACT_BACKEND_H
#define VYR_CONTRACT_BACKEND_H

#include <stdint.h>

#include <vyr/namedb.h>

#ifdef __cplusplus
extern "C" {
#endif

#define VYR_BACKEND_FILE_FMT "libtavrel-%s-db-%s.so.%u"
#define VYR_BACKEND_FILE_WORD "mac"
#define VYR_BACKEND_FILE_VERSION 2u
#define VYR_BACKEND_SYMBOL_FMT "%s_%s"

/* Entries shared in shape by the three databases. */
typedef void *(*vyr_be_open_fn)(void);
typedef int (*vyr_be_handle_fn)(void *db); /* close, set, end */

/* User label database (slots 5..11). */
typedef macent_t *(*vyr_be_getmacent_fn)(void *db);
typedef macent_t *(*vyr_be_getmacnam_fn)(void *db, const char *name);
typedef macent_t *(*vyr_be_getmacuid_fn)(void *db, uint32_t uid);
typedef int (*vyr_be_putmacent_fn)(void *db, const macent_t *ent);
typedef int (*vyr_be_rmmacnam_fn)(void *db, const char *name);
typedef int (*vyr_be_lch_fn)(void *pwrec, void *arg);

/* Level database (slots 5..10). */
typedef levent_t *(*vyr_be_getlevent_fn)(void *db);
typedef levent_t *(*vyr_be_getlevnam_fn)(void *db, const char *name);
typedef levent_t *(*vyr_be_getlevval_fn)(void *db, unsigned int value);
typedef int (*vyr_be_putlevent_fn)(void *db, const levent_t *ent);
typedef int (*vyr_be_rmlevnam_fn)(void *db, const char *name);
typedef int (*vyr_be_rmlevval_fn)(void *db, unsigned int value);

/* Category database (slots 5..10). */
typedef catent_t *(*vyr_be_getcatent_fn)(void *db);
typedef catent_t *(*vyr_be_getcatnam_fn)(void *db, const char *name);
typedef catent_t *(*vyr_be_getcatval_fn)(void *db, uint64_t value);
typedef int (*vyr_be_putcatent_fn)(void *db, const catent_t *ent);
typedef int (*vyr_be_rmcatnam_fn)(void *db, const char *name);
typedef int (*vyr_be_rmcatval_fn)(void *db, uint64_t value);

/*
 * Prototypes of a plug-in's entries, for the plug-in's own sources, so that
 * the compiler checks each definition against the contract. Example, in a
 * back-end named "files":
 *     VYR_BACKEND_DECLARE(files)
 *     void *files_openlevdb_r(void) { ... }
 * (in C++ sources, put the macro and the definitions inside extern "C").
 */
#define VYR_BACKEND_DECLARE_MAC(be)                                          \
	void *be##_openmacdb_r(void);                                        \
	int be##_closemacdb_r(void *db);                                     \
	int be##_setmacent_r(void *db);                                      \
	int be##_endmacent_r(void *db);                                      \
	macent_t *be##_getmacent_r(void *db);                                \
	macent_t *be##_getmacnam_r(void *db, const char *name);              \
	macent_t *be##_getmacuid_r(void *db, uint32_t uid);                  \
	int be##_putmacent_r(void *db, const macent_t *ent);                 \
	int be##_rmmacnam_r(void *db, const char *name);                     \
	int be##_do_getlch(void *pwrec, void *arg);                          \
	int be##_do_setlch(void *pwrec, void *arg);

#define VYR_BACKEND_DECLARE_LEV(be)                                          \
	void *be##_openlevdb_r(void);                                        \
	int be##_closelevdb_r(void *db);                                     \
	int be##_setlevent_r(void *db);                                      \
	int be##_endlevent_r(void *db);                                      \
	levent_t *be##_getlevent_r(void *db);                                \
	levent_t *be##_getlevnam_r(void *db, const char *name);              \
	levent_t *be##_getlevval_r(void *db, unsigned int value);            \
	int be##_putlevent_r(void *db, const levent_t *ent);                 \
	int be##_rmlevnam_r(void *db, const char *name);                     \
	int be##_rmlevval_r(void *db, unsigned int value);

#define VYR_BACKEND_DECLARE_CAT(be)                                          \
	void *be##_opencatdb_r(void);                                        \
	int be##_closecatdb_r(void *db);                                     \
	int be##_setcatent_r(void *db);                                      \
	int be##_endcatent_r(void *db);                                      \
	catent_t *be##_getcatent_r(void *db);                                \
	catent_t *be##_getcatnam_r(void *db, const char *name);              \
	catent_t *be##_getcatval_r(void *db, uint64_t value);                \
	int be##_putcatent_r(void *db, const catent_t *ent);                 \
	int be##_rmcatnam_r(void *db, const char *name);                     \
	int be##_rmcatval_r(void *db, uint64_t value);

#define VYR_BACKEND_DECLARE(be)                                              \
	VYR_BACKEND_DECLARE_MAC(be)                                          \
	VYR_BACKEND_DECLARE_LEV(be)                                          \
	VYR_BACKEND_DECLARE_CAT(be)

#ifdef __cplusplus
}
#endif

#endif /* VYR_CONTRACT_BACKEND_H */
