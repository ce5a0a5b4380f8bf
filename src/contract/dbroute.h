/*
 * dbroute: the configuration block of the name databases.
 *
 * Provided by the sibling library libdbroute.so.2 (platform/dbroute). libvyr
 * reads `dbroute_cfg` after calling `dbroute_init`, and never writes it.
 * The block is the exported symbol itself, not a pointer to it, and its byte
 * layout is fixed: the asserts below pin every field.
 *
 * Plain C declarations; compiles as C11 and as C++.
 */
#ifndef VYR_CONTRACT_DBROUTE_H
#define VYR_CONTRACT_DBROUTE_H

#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
#define DBROUTE_NOEXCEPT noexcept
extern "C" {
#else
#define DBROUTE_NOEXCEPT
#endif

/* Capacity of the name and charset fields, terminating NUL included. */
#define DBROUTE_NAME_MAX 64
/* Capacity of files_dir, terminating NUL included. */
#define DBROUTE_DIR_MAX 256

typedef struct dbroute_cfg_s {
    char     mac_backend[DBROUTE_NAME_MAX];  /*   0: back-end of the user label database   */
    char     mac_charset[DBROUTE_NAME_MAX];  /*  64: its charset, an iconv_open name        */
    char     files_dir[DBROUTE_DIR_MAX];     /* 128: absolute directory of the files
                                                       back-end; libvyr never reads it       */
    char     cat_backend[DBROUTE_NAME_MAX];  /* 384: back-end of the category database     */
    char     cat_charset[DBROUTE_NAME_MAX];  /* 448                                        */
    char     lev_backend[DBROUTE_NAME_MAX];  /* 512: back-end of the level database        */
    char     lev_charset[DBROUTE_NAME_MAX];  /* 576                                        */
    char     reserved1[128];                 /* 640: not read by libvyr                    */
    uint32_t mac_default_entry;              /* 768: non-zero enables default user entries */
} dbroute_cfg_t;

/*
 * Fills `dbroute_cfg` from the configuration file. Returns 0 on success, or a
 * negative value with errno set; on failure the block is left as it was.
 * Safe to call any number of times.
 */
int dbroute_init(void) DBROUTE_NOEXCEPT;

extern dbroute_cfg_t dbroute_cfg;

#ifdef __cplusplus
} /* extern "C" */
#define DBROUTE_STATIC_ASSERT(c, m) static_assert(c, m)
#else
#define DBROUTE_STATIC_ASSERT(c, m) _Static_assert(c, m)
#endif

DBROUTE_STATIC_ASSERT(sizeof(dbroute_cfg_t) == 772, "dbroute_cfg size");
DBROUTE_STATIC_ASSERT(offsetof(dbroute_cfg_t, mac_backend) == 0, "mac_backend offset");
DBROUTE_STATIC_ASSERT(offsetof(dbroute_cfg_t, mac_charset) == 64, "mac_charset offset");
DBROUTE_STATIC_ASSERT(offsetof(dbroute_cfg_t, files_dir) == 128, "files_dir offset");
DBROUTE_STATIC_ASSERT(offsetof(dbroute_cfg_t, cat_backend) == 384, "cat_backend offset");
DBROUTE_STATIC_ASSERT(offsetof(dbroute_cfg_t, cat_charset) == 448, "cat_charset offset");
DBROUTE_STATIC_ASSERT(offsetof(dbroute_cfg_t, lev_backend) == 512, "lev_backend offset");
DBROUTE_STATIC_ASSERT(offsetof(dbroute_cfg_t, lev_charset) == 576, "lev_charset offset");
DBROUTE_STATIC_ASSERT(offsetof(dbroute_cfg_t, reserved1) == 640, "reserved1 offset");
DBROUTE_STATIC_ASSERT(offsetof(dbroute_cfg_t, mac_default_entry) == 768, "mac_default_entry offset");
DBROUTE_STATIC_ASSERT(sizeof(((dbroute_cfg_t *)0)->mac_default_entry) == 4, "mac_default_entry width");

#undef DBROUTE_STATIC_ASSERT

#endif /* VYR_CONTRACT_DBROUTE_H */
