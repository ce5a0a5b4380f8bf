// Control side of "textmem", an in-memory level and category back-end for
// the tests of the text forms. The test programs link the plug-in, so the
// copy that the name databases load by file name is this very object and
// shares its tables and counters.
#pragma once

#include <cstdint>

extern "C" {

// What the text functions asked of the databases since the last reset.
struct textmem_stats {
	long lev_opens, lev_closes, lev_lookups;  // lookups: by name or by value
	long cat_opens, cat_closes, cat_lookups;
	long cat_sets, cat_ends, cat_nexts;       // the category walk
};

// Forgets every entry, counter and hook; every call succeeds again.
void textmem_reset(void);
void textmem_add_level(const char *name, uint8_t value);
void textmem_add_category(const char *name, uint64_t value);  // walk order
// A database that is switched off fails to open (ENOENT).
void textmem_set_open_ok(bool lev, bool cat);
// What the rewind of the category walk returns.
void textmem_set_catset_result(int rc);
// Called after every category open with the opens counted so far, so that a
// test can change the names between two reads of one call.
void textmem_set_cat_open_hook(void (*hook)(long opens));
textmem_stats textmem_get_stats(void);
void textmem_clear_stats(void);

} // extern "C"
