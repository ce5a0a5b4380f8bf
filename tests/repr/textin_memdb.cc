// In-memory back-end "textinmem" for the level and category databases.
//
// Entries live in two tables that the tests fill through textin_memdb.h. The
// plug-in counts opens, closes and name lookups, so tests can check how much
// database work a reader does. Records and handles come from malloc, so the
// failing allocator of the tests reaches them as it would a real back-end.
#include "repr/textin_memdb.h"

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
	textinmem_stats stats{};
};

Tables &tables()
{
	static Tables t;
	return t;
}

// A handle is a walk cursor of its own.
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
	e->name = strdup(name.c_str());
	if (e->name == nullptr) {
		std::free(e);
		return nullptr;
	}
	e->value = value;
	return e;
}

// A miss leaves errno alone: level and category back-ends owe no reason, and
// the readers must not depend on one.
template <class Ent, class Table>
Ent *find_by_name(const Table &table, const char *name)
{
	for (const auto &[n, v] : table)
		if (n == name)
			return make_entry<Ent>(n, v);
	return nullptr;
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

VYR_BACKEND_DECLARE_LEV(textinmem)
VYR_BACKEND_DECLARE_CAT(textinmem)

void textinmem_reset(void)
{
	tables() = Tables{};
}

void textinmem_add_level(const char *name, uint8_t value)
{
	tables().levels.emplace_back(name, value);
}

void textinmem_add_category(const char *name, uint64_t value)
{
	tables().categories.emplace_back(name, value);
}

void textinmem_set_open_ok(bool lev, bool cat)
{
	tables().lev_open_ok = lev;
	tables().cat_open_ok = cat;
}

textinmem_stats textinmem_get_stats(void)
{
	return tables().stats;
}

void textinmem_clear_stats(void)
{
	tables().stats = textinmem_stats{};
}

// ---- level database entries ----

void *textinmem_openlevdb_r(void)
{
	return open_cursor(tables().lev_open_ok, tables().stats.lev_opens);
}

int textinmem_closelevdb_r(void *db)
{
	return close_cursor(db, tables().stats.lev_closes);
}

int textinmem_setlevent_r(void *db) { return rewind(db); }
int textinmem_endlevent_r(void *db) { return rewind(db); }

levent_t *textinmem_getlevent_r(void *db)
{
	return next_entry<levent_t>(tables().levels, db);
}

levent_t *textinmem_getlevnam_r(void *, const char *name)
{
	++tables().stats.lev_lookups;
	return find_by_name<levent_t>(tables().levels, name);
}

levent_t *textinmem_getlevval_r(void *, unsigned int value)
{
	return find_by_value<levent_t>(tables().levels, static_cast<uint8_t>(value));
}

// ---- category database entries ----

void *textinmem_opencatdb_r(void)
{
	return open_cursor(tables().cat_open_ok, tables().stats.cat_opens);
}

int textinmem_closecatdb_r(void *db)
{
	return close_cursor(db, tables().stats.cat_closes);
}

int textinmem_setcatent_r(void *db) { return rewind(db); }
int textinmem_endcatent_r(void *db) { return rewind(db); }

catent_t *textinmem_getcatent_r(void *db)
{
	return next_entry<catent_t>(tables().categories, db);
}

catent_t *textinmem_getcatnam_r(void *, const char *name)
{
	++tables().stats.cat_lookups;
	return find_by_name<catent_t>(tables().categories, name);
}

catent_t *textinmem_getcatval_r(void *, uint64_t value)
{
	return find_by_value<catent_t>(tables().categories, value);
}

} // extern "C"
