// LeakSanitizer: when a test program links a back-end plug-in that libvyr
// then dlopens by name, the loader keeps a dependency list for it. It lives
// as long as the plug-in, which is never unloaded, off a record the checker
// doesn't scan: not a leak of the library's.
extern "C" const char *__lsan_default_suppressions() { return "leak:_dl_map_object_deps\n"; }
