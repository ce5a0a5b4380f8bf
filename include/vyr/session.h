/*
 * Session directories: directories named after a label, under a base
 * directory and an optional sub-directory, that carry that label themselves.
 */
#ifndef VYR_SESSION_H
#define VYR_SESSION_H

#include <vyr/common.h>
#include <vyr/types.h>

#include <stdint.h>


VYR_BEGIN_DECLS

/* Creates the directory at path, or repairs the one found there: anything
 * that isn't a directory is unlinked first, then owner (uid and gid), the
 * permission bits (mode) and the label are set where they differ.  A label
 * with a non-zero integrity level is stored with the "ccnri" type bit added.
 * Returns 0 or -1 (errno from the failing call).  label is left unchanged. */
int vyrlugm_mkdir(const char *path, vyrl_t *label, uint32_t uid, uint32_t gid,
                  uint32_t mode) VYR_NOEXCEPT;

/* "base/sub/l<lev>i<ilev>c0x<cat>t0x<type>" as a new string, numbers only;
 * NULL on failure. */
char *vyrml_session_dir(const char *base, const char *sub, const vyrml_t *ml) VYR_NOEXCEPT;
char *vyrl_session_dir(const char *base, const char *sub, const vyrl_t *l) VYR_NOEXCEPT;

/* Makes (or repairs) the session directory of label under base/sub and
 * returns its path as a new string, or NULL.  A non-empty sub first gets the
 * label of base.  A non-empty link adds the "CCNRA" type bits to the
 * directory's label and creates two symbolic links in it, named link and
 * "vyr", pointing back at base/sub (or base when sub is empty). */
char *vyrlugm_make_session_dir(const char *base, const char *sub,
                               const char *link, vyrl_t *label, uint32_t uid,
                               uint32_t gid, uint32_t mode) VYR_NOEXCEPT;

VYR_END_DECLS

#endif /* VYR_SESSION_H */
