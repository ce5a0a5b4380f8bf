// A small fixed level and category database for the classic text tests,
// served as the back-end "classicdb".  It counts what it is asked, so that
// tests can tell how often the library opened, looked up and walked.
#include "classicdb.h"

#include "contract/backend.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <iterator>

namespace {

struct Level {
    unsigned value;
    const char *name;
};
struct Category {
    uint64_t value;
    const char *name;
};

// "9lives" reads as a level name before it could fail as a number; "face" is a
// category name that wins over the number 0xface.  No other name reads as a
// number, so numeric texts read back as what they say.
constexpr Level kLevels[] = {{1, "one"}, {2, "two"}, {7, "seven"}, {9, "9lives"}, {200, "top"}};
constexpr Category kCategories[] = {
    {0x1, "n"}, {0x2, "s"}, {0x4, "w"}, {0x30, "pair"}, {0x6, "sw"}, {0x40, "face"},
};

size_t cat_growth() {
    return classicdb_stats.grow_cat_names ? static_cast<size_t>(classicdb_stats.cat_opens) : 0;
}

int g_lev_handle;
int g_cat_handle;
size_t g_cat_cursor;

template <class Entry, class Value>
Entry *make_entry(const char *name, Value value, size_t grow = 0) {
    auto *e = static_cast<Entry *>(std::calloc(1, sizeof(Entry)));
    if (!e) return nullptr;
    size_t len = std::strlen(name);
    e->name = static_cast<char *>(std::malloc(len + grow + 1));
    if (e->name) {
        std::memcpy(e->name, name, len);
        std::memset(e->name + len, '+', grow);
        e->name[len + grow] = '\0';
    }
    if (!e->name) {
        std::free(e);
        return nullptr;
    }
    e->value = value;
    return e;
}

}  // namespace

extern "C" {

classicdb_stats_t classicdb_stats;

VYR_BACKEND_DECLARE_LEV(classicdb)
VYR_BACKEND_DECLARE_CAT(classicdb)

void *classicdb_openlevdb_r(void) {
    ++classicdb_stats.lev_opens;
    return &g_lev_handle;
}
int classicdb_closelevdb_r(void *) {
    ++classicdb_stats.lev_closes;
    return 0;
}
int classicdb_setlevent_r(void *) { return 0; }
int classicdb_endlevent_r(void *) { return 0; }
levent_t *classicdb_getlevent_r(void *) { return nullptr; }
int classicdb_putlevent_r(void *, const levent_t *) { return -1; }
int classicdb_rmlevnam_r(void *, const char *) { return -1; }
int classicdb_rmlevval_r(void *, unsigned int) { return -1; }

levent_t *classicdb_getlevnam_r(void *, const char *name) {
    ++classicdb_stats.lev_lookups;
    for (const Level &l : kLevels)
        if (std::strcmp(l.name, name) == 0) return make_entry<levent_t>(l.name, static_cast<uint8_t>(l.value));
    errno = ENOENT;
    return nullptr;
}

levent_t *classicdb_getlevval_r(void *, unsigned int value) {
    ++classicdb_stats.lev_lookups;
    for (const Level &l : kLevels)
        if (l.value == value) return make_entry<levent_t>(l.name, static_cast<uint8_t>(l.value));
    errno = ENOENT;
    return nullptr;
}

void *classicdb_opencatdb_r(void) {
    ++classicdb_stats.cat_opens;
    return &g_cat_handle;
}
int classicdb_closecatdb_r(void *) {
    ++classicdb_stats.cat_closes;
    return 0;
}
int classicdb_setcatent_r(void *) {
    ++classicdb_stats.cat_walks;
    g_cat_cursor = 0;
    return 0;
}
int classicdb_endcatent_r(void *) { return 0; }
int classicdb_putcatent_r(void *, const catent_t *) { return -1; }
int classicdb_rmcatnam_r(void *, const char *) { return -1; }
int classicdb_rmcatval_r(void *, uint64_t) { return -1; }

catent_t *classicdb_getcatent_r(void *) {
    if (g_cat_cursor >= std::size(kCategories)) return nullptr;
    const Category &c = kCategories[g_cat_cursor++];
    return make_entry<catent_t>(c.name, c.value, cat_growth());
}

catent_t *classicdb_getcatnam_r(void *, const char *name) {
    ++classicdb_stats.cat_lookups;
    for (const Category &c : kCategories)
        if (std::strcmp(c.name, name) == 0) return make_entry<catent_t>(c.name, c.value);
    errno = ENOENT;
    return nullptr;
}

catent_t *classicdb_getcatval_r(void *, uint64_t value) {
    ++classicdb_stats.cat_lookups;
    for (const Category &c : kCategories)
        if (c.value == value) return make_entry<catent_t>(c.name, c.value, cat_growth());
    errno = ENOENT;
    return nullptr;
}

}  // extern "C"
