// The handle-based functions of the three name databases.
//
// Each function starts its database, takes its bound entry (failing with
// ENOSYS when the plug-in has none) and forwards the call, converting names
// between the locale's charset and the back-end's where the database asks
// for it. The three databases are twins; one template per kind of call
// serves all of them.

#include <vyr/namedb.h>

#include "contract/tavrel_aux.h"
#include "namedb/entries.hh"
#include "namedb/switch.hh"

#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>

namespace vyr::namedb {
namespace {

template <Db D> struct DbTypes;
template <> struct DbTypes<Db::mac> {
	using Entry = macent_t;
	using Key = uint32_t;
};
template <> struct DbTypes<Db::lev> {
	using Entry = levent_t;
	using Key = unsigned int; // a level, 0..255
};
template <> struct DbTypes<Db::cat> {
	using Entry = catent_t;
	using Key = uint64_t;
};
template <Db D> using entry_t = typename DbTypes<D>::Entry;
template <Db D> using key_t = typename DbTypes<D>::Key;

// The level functions take any int and use its low 8 bits.
unsigned int level_key(int value) noexcept { return static_cast<unsigned int>(value) & 0xffu; }

template <Db D>
void *open_db() noexcept
{
	auto fn = bound<void *(*)()>(D, kOpen);
	return fn ? fn() : nullptr;
}

// close, set and end: the handle goes through untested, NULL included.
template <Db D>
int handle_call(Slot slot, void *db) noexcept
{
	auto fn = bound<int (*)(void *)>(D, slot);
	return fn ? fn(db) : -1;
}

// A record from the back-end on its way to the caller. Failing conversion
// leaves the name as the back-end wrote it, which is no failure.
template <Db D>
entry_t<D> *to_caller(entry_t<D> *e) noexcept
{
	if (e)
		name_to_caller(D, e->name);
	return e;
}

template <Db D>
entry_t<D> *get_ent(void *db) noexcept
{
	auto fn = bound<entry_t<D> *(*)(void *)>(D, kGetEnt);
	return fn ? to_caller<D>(fn(db)) : nullptr;
}

// Lookup by uid, level or category value. When the back-end finds nothing,
// `on_miss(key)` decides what the caller gets.
template <Db D, class OnMiss>
entry_t<D> *get_key(void *db, key_t<D> key, OnMiss &&on_miss) noexcept
{
	auto fn = bound<entry_t<D> *(*)(void *, key_t<D>)>(D, kGetKey);
	if (!fn)
		return nullptr;
	if (entry_t<D> *e = fn(db, key))
		return to_caller<D>(e);
	return on_miss(key);
}

template <Db D>
entry_t<D> *get_key(void *db, key_t<D> key) noexcept
{
	return get_key<D>(db, key, [](key_t<D>) -> entry_t<D> * { return nullptr; });
}

// Lookup by name. When the back-end finds nothing, `on_miss(name)` decides
// what the caller gets (the user database may make a default entry); it is
// given the caller's own name, never the copy made for the back-end.
template <Db D, class OnMiss>
entry_t<D> *get_nam(void *db, const char *name, OnMiss &&on_miss) noexcept
{
	auto fn = bound<entry_t<D> *(*)(void *, const char *)>(D, kGetNam);
	if (!fn || !name)
		return nullptr;
	const BackendName out(D, name);
	if (!out.ok())
		return nullptr;
	if (entry_t<D> *e = fn(db, out.get()))
		return to_caller<D>(e);
	return on_miss(name);
}

template <Db D>
entry_t<D> *get_nam(void *db, const char *name) noexcept
{
	return get_nam<D>(db, name, [](const char *) -> entry_t<D> * { return nullptr; });
}

// The back-end gets a converted copy of the record; the caller's record is
// never changed. Without memory for the copy the entry is called with NULL,
// and a name that can't even be copied travels as NULL.
template <Db D>
int put_ent(void *db, const entry_t<D> *e) noexcept
{
	auto fn = bound<int (*)(void *, const entry_t<D> *)>(D, kPut);
	if (!fn)
		return -1;
	if (!e || !converting(D))
		return fn(db, e);
	entry_t<D> *copy = alloc_entry<entry_t<D>>();
	if (!copy)
		return fn(db, nullptr);
	*copy = *e;
	copy->name = e->name ? copy_to_backend(D, e->name) : nullptr;
	const int r = fn(db, copy);
	free_entry(copy);
	return r;
}

template <Db D>
int rm_nam(void *db, const char *name) noexcept
{
	auto fn = bound<int (*)(void *, const char *)>(D, kRmNam);
	if (!fn || !name)
		return -1;
	const BackendName out(D, name);
	return out.ok() ? fn(db, out.get()) : -1;
}

template <Db D>
int rm_key(void *db, key_t<D> key) noexcept
{
	auto fn = bound<int (*)(void *, key_t<D>)>(D, kSlot10);
	return fn ? fn(db, key) : -1;
}

// Whether a value-lookup result says the value exists: a record, or a
// back-end's EILSEQ, which declares a value known without a record.
template <class E>
bool value_known(E *e) noexcept
{
	if (!e)
		return errno == EILSEQ;
	free_entry(e);
	return true;
}

// Runs `query(db)` on the caller's handle, or on a handle opened and closed
// for this query alone. A failed open, or a failed close of that handle,
// turns the answer into -1.
template <Db D, class Query>
int with_own_handle(void *db, Query &&query) noexcept
{
	if (db)
		return query(db);
	db = open_db<D>();
	if (!db)
		return -1;
	const int answer = query(db);
	return handle_call<D>(kClose, db) != 0 ? -1 : answer;
}

// A category record must stand for exactly one bit.
bool one_bit(const catent_t *e) noexcept
{
	return e && e->value != 0 && (e->value & (e->value - 1)) == 0;
}

// --- user label database: default entries and the lch hooks ---

// An all-zero user entry that carries only a name (a copy of `name`, or
// NULL if that copy fails).
macent_t *default_entry(const char *name) noexcept
{
	auto *e = static_cast<macent_t *>(std::calloc(1, sizeof(macent_t)));
	if (e)
		e->name = strdup(name);
	return e;
}

bool user_unknown() noexcept { return errno == ENOENT || errno == ENODATA; }

macent_t *default_by_name(const char *name) noexcept
{
	if (!user_unknown() || !default_user_entries())
		return nullptr;
	const int saved = errno; // the back-end's ENOENT/ENODATA stays visible
	macent_t *e = default_entry(name);
	if (e)
		errno = saved;
	return e;
}

const char *user_name(const passwd *pw) noexcept { return pw->pw_name; }

macent_t *default_by_uid(uint32_t uid) noexcept
{
	if (!user_unknown() || !default_user_entries())
		return nullptr;
	const malloc_ptr<passwd> pw(zenk_getpwuid(uid));
	if (!pw)
		return nullptr;
	macent_t *e = default_entry(user_name(pw.get()));
	if (e)
		errno = 0;
	return e;
}

// The lch hooks take a user record, not a handle. An empty slot fails with
// EOPNOTSUPP before the user is looked up.
template <class Lookup>
int call_lch(Slot slot, Lookup &&lookup, void *arg) noexcept
{
	auto fn = bound<int (*)(void *, void *)>(Db::mac, slot, EOPNOTSUPP);
	if (!fn)
		return -1;
	const malloc_ptr<passwd> pw(lookup());
	if (!pw)
		return -1;
	return fn(pw.get(), arg);
}

} // namespace
} // namespace vyr::namedb

using namespace vyr::namedb;

extern "C" {

// ---- open, close, set, end ----

void *openmacdb_r(void) noexcept { return open_db<Db::mac>(); }
void *openlevdb_r(void) noexcept { return open_db<Db::lev>(); }
void *opencatdb_r(void) noexcept { return open_db<Db::cat>(); }

int closemacdb_r(void *db) noexcept { return handle_call<Db::mac>(kClose, db); }
int closelevdb_r(void *db) noexcept { return handle_call<Db::lev>(kClose, db); }
int closecatdb_r(void *db) noexcept { return handle_call<Db::cat>(kClose, db); }

int setmacent_r(void *db) noexcept { return handle_call<Db::mac>(kSet, db); }
int setlevent_r(void *db) noexcept { return handle_call<Db::lev>(kSet, db); }
int setcatent_r(void *db) noexcept { return handle_call<Db::cat>(kSet, db); }

int endmacent_r(void *db) noexcept { return handle_call<Db::mac>(kEnd, db); }
int endlevent_r(void *db) noexcept { return handle_call<Db::lev>(kEnd, db); }
int endcatent_r(void *db) noexcept { return handle_call<Db::cat>(kEnd, db); }

// ---- level database ----

levent_t *getlevent_r(void *db) noexcept { return get_ent<Db::lev>(db); }
levent_t *getlevnam_r(void *db, const char *name) noexcept { return get_nam<Db::lev>(db, name); }
levent_t *getlevval_r(void *db, int value) noexcept { return get_key<Db::lev>(db, level_key(value)); }
int putlevent_r(void *db, const levent_t *ent) noexcept { return put_ent<Db::lev>(db, ent); }
int rmlevnam_r(void *db, const char *name) noexcept { return rm_nam<Db::lev>(db, name); }
int rmlevval_r(void *db, int value) noexcept { return rm_key<Db::lev>(db, level_key(value)); }

int levexstval(void *db, int value) noexcept
{
	return with_own_handle<Db::lev>(db, [value](void *h) { return value_known(getlevval_r(h, value)) ? 0 : 1; });
}

// ---- category database ----

catent_t *getcatent_r(void *db) noexcept { return get_ent<Db::cat>(db); }
catent_t *getcatnam_r(void *db, const char *name) noexcept { return get_nam<Db::cat>(db, name); }
catent_t *getcatval_r(void *db, uint64_t value) noexcept { return get_key<Db::cat>(db, value); }
int rmcatnam_r(void *db, const char *name) noexcept { return rm_nam<Db::cat>(db, name); }
int rmcatval_r(void *db, uint64_t value) noexcept { return rm_key<Db::cat>(db, value); }

int putcatent_r(void *db, const catent_t *ent) noexcept
{
	// Refused before start-up, so a bad record fails alike with or without
	// a plug-in.
	if (!one_bit(ent)) {
		errno = EINVAL;
		return -1;
	}
	return put_ent<Db::cat>(db, ent);
}

int is_cats_valid(void *db, uint64_t mask) noexcept
{
	if (mask == 0)
		return 0;
	return with_own_handle<Db::cat>(db, [mask](void *h) {
		for (unsigned bit = 0; bit < 64; ++bit) {
			const uint64_t one = uint64_t{1} << bit;
			if ((mask & one) && !value_known(getcatval_r(h, one)))
				return 1; // higher bits are not tried
		}
		return 0;
	});
}

// ---- user label database ----

macent_t *getmacent_r(void *db) noexcept { return get_ent<Db::mac>(db); }
macent_t *getmacnam_r(void *db, const char *name) noexcept
{
	return get_nam<Db::mac>(db, name, default_by_name);
}

macent_t *getmacuid_r(void *db, uint32_t uid) noexcept
{
	return get_key<Db::mac>(db, uid, default_by_uid);
}

int putmacent_r(void *db, const macent_t *ent) noexcept { return put_ent<Db::mac>(db, ent); }
int rmmacnam_r(void *db, const char *name) noexcept { return rm_nam<Db::mac>(db, name); }

int getlchuid(uint32_t uid, void *arg) noexcept
{
	return call_lch(kSlot10, [uid] { return zenk_getpwuid(uid); }, arg);
}
int getlchnam(const char *name, void *arg) noexcept
{
	return call_lch(kSlot10, [name] { return zenk_getpwnam(name); }, arg);
}
int setlchuid(uint32_t uid, void *arg) noexcept
{
	return call_lch(kSlot11, [uid] { return zenk_getpwuid(uid); }, arg);
}
int setlchnam(const char *name, void *arg) noexcept
{
	return call_lch(kSlot11, [name] { return zenk_getpwnam(name); }, arg);
}

} // extern "C"
