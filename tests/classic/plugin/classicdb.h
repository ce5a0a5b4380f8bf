// Counters of the "classicdb" test back-end.  Test programs link the plug-in
// directly, so the library's dlopen of it finds this same copy.
#pragma once

#ifdef __cplusplus
extern "C" {
#endif

typedef struct classicdb_stats {
    int lev_opens, lev_closes, lev_lookups;
    int cat_opens, cat_closes, cat_lookups, cat_walks;
    /* When set, category names grow by one "+" with every open, as if the
     * database changed between two reads. */
    int grow_cat_names;
} classicdb_stats_t;

extern classicdb_stats_t classicdb_stats;

#ifdef __cplusplus
}
#endif
