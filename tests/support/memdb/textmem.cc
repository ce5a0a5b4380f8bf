// "textmem": level and category tables held in memory, with a counter for
// each kind of call, so that the tests see how much database work the text
// functions do. Handles, records and names come from malloc/calloc, so the
// tests' failing allocator reaches them as it would a real back-end.
#include "support/memdb/textmem.h"

#include "contract/backend.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <string>
#include <string_view>
#include <type_traits>
#include <utility>
#include <vector>

namespace {

struct Tables {
	std::vector<std::pair<std::string, uint8_t>> levels;
	std::vector<std::pair<std::string, uint64_t>> categories;
	bool lev_open_ok = true;
	bool cat_open_ok = true;
	int catset_result = 0;
	void (*cat_open_hook)(long) = nullptr;
	textmem_stats stats{};
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
	// out of reach of the failing allocator.
	e->name = static_cast<char *>(std::malloc(name.size() + 1));
	if (e->name == nullptr) {
		std::free(e);
		return nullptr;
	}
	std::memcpy(e->name, name.c_str(), name.size() + 1);
	e->value = value;
	return e;
}

// The first row whose name or value matches. A miss by name leaves errno
// alone, so that the readers can't come to depend on a reason.
template <class Ent, class Table, class Key>
Ent *find(const Table &table, const Key &key, long &lookups)
{
	++lookups;
	for (const auto &[n, v] : table) {
		if constexpr (std::is_same_v<Key, std::string_view>) {
			if (n == key)
				return make_entry<Ent>(n, v);
		} else if (v == key) {
			return make_entry<Ent>(n, v);
		}
	}
	if constexpr (!std::is_same_v<Key, std::string_view>)
		errno = ENOENT;
	return nullptr;
}


} // namespace

extern "C" {

VYR_BACKEND_DECLARE_LEV(textmem)
VYR_BACKEND_DECLARE_CAT(textmem)

void textmem_reset(void) { tables() = Tables{}; }
void textmem_add_level(const char *name, uint8_t value) { tables().levels.emplace_back(name, value); }
void textmem_add_category(const char *name, uint64_t value) { tables().categories.emplace_back(name, value); }
void textmem_set_catset_result(int rc) { tables().catset_result = rc; }
void textmem_set_cat_open_hook(void (*hook)(long)) { tables().cat_open_hook = hook; }
textmem_stats textmem_get_stats(void) { return tables().stats; }
void textmem_clear_stats(void) { tables().stats = textmem_stats{}; }

void textmem_set_open_ok(bool lev, bool cat)
{
	tables().lev_open_ok = lev;
	tables().cat_open_ok = cat;
}

// ---- level database: no walk, which the text functions never use ----

void *textmem_openlevdb_r(void) { return open_cursor(tables().lev_open_ok, tables().stats.lev_opens); }
int textmem_closelevdb_r(void *db) { return close_cursor(db, tables().stats.lev_closes); }

levent_t *textmem_getlevnam_r(void *, const char *name)
{
	return find<levent_t>(tables().levels, std::string_view(name), tables().stats.lev_lookups);
}

levent_t *textmem_getlevval_r(void *, unsigned int value)
{
	return find<levent_t>(tables().levels, static_cast<uint8_t>(value), tables().stats.lev_lookups);
}

// ---- category database ----

void *textmem_opencatdb_r(void)
{
	void *db = open_cursor(tables().cat_open_ok, tables().stats.cat_opens);
	if (db != nullptr && tables().cat_open_hook != nullptr)
		tables().cat_open_hook(tables().stats.cat_opens);
	return db;
}
int textmem_closecatdb_r(void *db) { return close_cursor(db, tables().stats.cat_closes); }

int textmem_setcatent_r(void *db)
{
	++tables().stats.cat_sets;
	static_cast<Cursor *>(db)->next = 0;
	return tables().catset_result;
}

int textmem_endcatent_r(void *)
{
	++tables().stats.cat_ends;
	return 0;
}

catent_t *textmem_getcatent_r(void *db)
{
	++tables().stats.cat_nexts;
	auto *c = static_cast<Cursor *>(db);
	if (c->next >= tables().categories.size())
		return nullptr;
	const auto &[n, v] = tables().categories[c->next++];
	return make_entry<catent_t>(n, v);
}

catent_t *textmem_getcatnam_r(void *, const char *name)
{
	return find<catent_t>(tables().categories, std::string_view(name), tables().stats.cat_lookups);
}

catent_t *textmem_getcatval_r(void *, uint64_t value)
{
	return find<catent_t>(tables().categories, value, tables().stats.cat_lookups);
}

} // extern "C"
