// "textoutmem": level and category tables held in memory, with counters of
// every call, so that tests can see how much database work a writer does.
// Handles, records and names come from malloc/calloc, so the failing
// allocator of the tests reaches them as it would reach a real back-end.
#include "repr/textout_memdb.h"

#include "contract/backend.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <string>
#include <utility>
#include <vector>

namespace {

struct Tables {
	std::vector<std::pair<std::string, uint8_t>> levels;
	std::vector<std::pair<std::string, uint64_t>> categories;
	bool lev_open_ok = true;
	bool cat_open_ok = true;
	int catset_result = 0;
	textoutmem_stats stats{};
};

Tables &tables()
{
	static Tables t;
	return t;
}

// A handle is the position of a walk.
struct Cursor {
	size_t next;
};

void *open_cursor(bool ok, long &opens)
{
	if (!ok) {
		errno = ENOENT;
		return nullptr;
	}
	auto *c = static_cast<Cursor *>(std::malloc(sizeof(Cursor)));
	if (c == nullptr)
		return nullptr;
	c->next = 0;
	++opens;
	return c;
}

int close_cursor(void *db, long &closes)
{
	std::free(db);
	++closes;
	return 0;
}

template <class Ent, class Value>
Ent *make_entry(const std::string &name, Value value)
{
	auto *e = static_cast<Ent *>(std::calloc(1, sizeof(Ent)));
	if (e == nullptr)
		return nullptr;
	// malloc rather than strdup: sanitizer runtimes serve strdup themselves,
	// out of reach of the tests' failing allocator.
	e->name = static_cast<char *>(std::malloc(name.size() + 1));
	if (e->name == nullptr) {
		std::free(e);
		return nullptr;
	}
	std::memcpy(e->name, name.c_str(), name.size() + 1);
	e->value = value;
	return e;
}

template <class Ent, class Table, class Value>
Ent *find_by_value(const Table &table, Value value)
{
	for (const auto &[n, v] : table)
		if (v == value)
			return make_entry<Ent>(n, v);
	errno = ENOENT;
	return nullptr;
}

template <class Ent, class Table>
Ent *next_entry(const Table &table, void *db)
{
	auto *c = static_cast<Cursor *>(db);
	if (c->next >= table.size())
		return nullptr;
	const auto &[n, v] = table[c->next++];
	return make_entry<Ent>(n, v);
}

int rewind(void *db)
{
	static_cast<Cursor *>(db)->next = 0;
	return 0;
}

} // namespace

extern "C" {

VYR_BACKEND_DECLARE_LEV(textoutmem)
VYR_BACKEND_DECLARE_CAT(textoutmem)

void textoutmem_reset(void) { tables() = Tables{}; }

void textoutmem_add_level(const char *name, uint8_t value)
{
	tables().levels.emplace_back(name, value);
}

void textoutmem_add_category(const char *name, uint64_t value)
{
	tables().categories.emplace_back(name, value);
}

void textoutmem_set_open_ok(bool lev, bool cat)
{
	tables().lev_open_ok = lev;
	tables().cat_open_ok = cat;
}

void textoutmem_set_catset_result(int rc) { tables().catset_result = rc; }

textoutmem_stats textoutmem_get_stats(void) { return tables().stats; }

void textoutmem_clear_stats(void) { tables().stats = textoutmem_stats{}; }

// ---- level database ----

void *textoutmem_openlevdb_r(void)
{
	return open_cursor(tables().lev_open_ok, tables().stats.lev_opens);
}

int textoutmem_closelevdb_r(void *db) { return close_cursor(db, tables().stats.lev_closes); }
int textoutmem_setlevent_r(void *db) { return rewind(db); }
int textoutmem_endlevent_r(void *db) { return rewind(db); }

levent_t *textoutmem_getlevent_r(void *db) { return next_entry<levent_t>(tables().levels, db); }

levent_t *textoutmem_getlevnam_r(void *, const char *)
{
	errno = ENOSYS;
	return nullptr;
}

levent_t *textoutmem_getlevval_r(void *, unsigned int value)
{
	++tables().stats.lev_lookups;
	return find_by_value<levent_t>(tables().levels, static_cast<uint8_t>(value));
}

// ---- category database ----

void *textoutmem_opencatdb_r(void)
{
	return open_cursor(tables().cat_open_ok, tables().stats.cat_opens);
}

int textoutmem_closecatdb_r(void *db) { return close_cursor(db, tables().stats.cat_closes); }

int textoutmem_setcatent_r(void *db)
{
	++tables().stats.cat_sets;
	rewind(db);
	return tables().catset_result;
}

int textoutmem_endcatent_r(void *db)
{
	++tables().stats.cat_ends;
	return rewind(db);
}

catent_t *textoutmem_getcatent_r(void *db)
{
	++tables().stats.cat_nexts;
	return next_entry<catent_t>(tables().categories, db);
}

catent_t *textoutmem_getcatnam_r(void *, const char *)
{
	errno = ENOSYS;
	return nullptr;
}

catent_t *textoutmem_getcatval_r(void *, uint64_t value)
{
	++tables().stats.cat_lookups;
	return find_by_value<catent_t>(tables().categories, value);
}

} // extern "C"
