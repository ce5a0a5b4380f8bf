/*
 * Common definitions of the libvyr public headers.
 *
 * Every public header compiles as C11 and as C++; in C++ the declarations
 * have C linkage, so the library's symbols are plain, unmangled names.
 */
#ifndef VYR_COMMON_H
#define VYR_COMMON_H

#ifdef __cplusplus
#define VYR_BEGIN_DECLS extern "C" {
#define VYR_END_DECLS }
#else
#define VYR_BEGIN_DECLS
#define VYR_END_DECLS
#endif

/* The library's functions never throw; in C++ their declarations say so, so
 * that they match the definitions inside the library. */
#ifdef __cplusplus
#define VYR_NOEXCEPT noexcept
#else
#define VYR_NOEXCEPT
#endif

/* Compile-time layout checks that read the same in C11 and C++. */
#ifdef __cplusplus
#define VYR_STATIC_ASSERT(cond, msg) static_assert(cond, msg)
#else
#define VYR_STATIC_ASSERT(cond, msg) _Static_assert(cond, msg)
#endif

#endif /* VYR_COMMON_H */
