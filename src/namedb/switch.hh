// The switch between the exported database functions and the back-end
// plug-ins: lazy start-up, entry binding, and charset conversion of names.
//
// Per-database state lives in static storage that is zero at load time and
// is only ever written by the start-up of that database. Invariants:
//  - `started` set  => the configuration was read, the locale charset noted,
//    and either a plug-in is loaded with its entries bound or the back-end
//    name asked for none (all slots empty);
//  - `convert` is only set by a loader, so a database without plug-in never
//    converts;
//  - a slot, once bound, is never changed.
#pragma once

#include <vyr/namedb.h>

#include "common/c_api.hh"
#include "namedb/entries.hh"

#include <cerrno>
#include <cstdint>

namespace vyr::namedb {

enum class Db : unsigned { mac, lev, cat };

// Slot numbers in binding order. Slot 10 is do_getlch for the user label
// database and the removal by value for the two others; slot 11 exists
// only in the user label database (do_setlch).
enum Slot : unsigned {
	kOpen,
	kClose,
	kSet,
	kEnd,
	kGetEnt,
	kGetNam,
	kGetKey, // by uid, level value or category value
	kPut,
	kRmNam,
	kSlot10, // do_getlch / rm*val_r
	kSlot11, // do_setlch
	kSlotCount
};

// Runs the start-up if the database isn't started yet; false if it failed.
bool start(Db db) noexcept;

// The bound entry `slot`, after a successful start-up. On failure returns
// NULL: errno is `missing` for an empty slot and as the start-up left it
// otherwise.
void *bound_slot(Db db, Slot slot, int missing = ENOSYS) noexcept;

template <class Fn>
Fn bound(Db db, Slot slot, int missing = ENOSYS) noexcept
{
	return reinterpret_cast<Fn>(bound_slot(db, slot, missing));
}

// Whether names of this database are converted between charsets.
bool converting(Db db) noexcept;

// Whether the configuration asks for default user entries.
bool default_user_entries() noexcept;

// A name as the back-end should receive it: the caller's own pointer while
// the database doesn't convert, else a converted copy (or a plain copy if
// the conversion is refused) that lives as long as this object.
class BackendName {
public:
	BackendName(Db db, const char *name) noexcept;
	// False for a NULL name or when no copy could be made.
	bool ok() const noexcept { return ptr_ != nullptr; }
	const char *get() const noexcept { return ptr_; }

private:
	const char *ptr_ = nullptr;
	malloc_ptr<char> owned_;
};

// Converts a back-end string into the caller's charset in place: `name` is
// replaced by a new string only when the conversion succeeds. A database
// that doesn't convert, and a NULL name, are left alone.
void name_to_caller(Db db, char *&name) noexcept;

// Converted or plain copy of `name` towards the back-end; NULL only when
// even the plain copy fails. Requires a converting database.
char *copy_to_backend(Db db, const char *name) noexcept;

} // namespace vyr::namedb
