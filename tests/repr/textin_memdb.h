// Control side of the in-memory name back-end "textinmem" used by the text
// reader tests. The test programs link the plug-in directly, so the copy that
// libvyr loads by its file name is this same object and shares its tables.
#pragma once

#include <cstdint>

extern "C" {

struct textinmem_stats {
	long lev_opens, lev_closes, lev_lookups;
	long cat_opens, cat_closes, cat_lookups;
};

// Forgets every entry and zeroes the counters; both databases open again.
void textinmem_reset(void);
void textinmem_add_level(const char *name, uint8_t value);
void textinmem_add_category(const char *name, uint64_t value);
// A database that is switched off fails to open with ENOENT.
void textinmem_set_open_ok(bool lev, bool cat);
textinmem_stats textinmem_get_stats(void);
void textinmem_clear_stats(void);

} // extern "C"
