// Control side of "textoutmem", the in-memory level and category back-end of
// the text writer tests.  The test programs link the plug-in directly, so the
// copy that the name databases load by file name is this very object and
// shares its tables and counters.
#pragma once

#include <cstdint>

extern "C" {

// What the writers did to the databases since the last reset.
struct textoutmem_stats {
	long lev_opens, lev_closes, lev_lookups;
	long cat_opens, cat_closes, cat_lookups;
	long cat_sets, cat_ends, cat_nexts;
};

// Forgets all entries, clears the counters and makes every call succeed.
void textoutmem_reset(void);
void textoutmem_add_level(const char *name, uint8_t value);
// Categories are walked in the order they were added.
void textoutmem_add_category(const char *name, uint64_t value);
// A database that is switched off fails to open (ENOENT).
void textoutmem_set_open_ok(bool lev, bool cat);
// Result of the category walk's rewind.
void textoutmem_set_catset_result(int rc);
textoutmem_stats textoutmem_get_stats(void);
void textoutmem_clear_stats(void);

} // extern "C"
