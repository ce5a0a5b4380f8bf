// The dynamic loader keeps a block for the lifetime of a plug-in that the
// name databases load and never unload; it is not the library's to free.
extern "C" const char *__lsan_default_suppressions() { return "leak:_dl_map_object_deps\n"; }
