// Entry records of the name databases, seen generically.
//
// The three databases are twins that differ in their record type. The
// helpers here let one template serve all three: release a record, copy a
// record's non-name fields between its narrow and wide forms, and allocate
// a record the way callers expect (plain malloc, released with free).
#pragma once

#include <vyr/namedb.h>

#include <cstdlib>
#include <cstring>
#include <type_traits>

namespace vyr::namedb {

// Narrow <-> wide record pairs.
template <class E> struct WideOf;
template <> struct WideOf<macent_t> { using type = wcmacent_t; };
template <> struct WideOf<levent_t> { using type = wclevent_t; };
template <> struct WideOf<catent_t> { using type = wccatent_t; };
template <class E> using wide_t = typename WideOf<E>::type;

// Releases a record and its name; NULL does nothing. Serves both the narrow
// and the wide records, which share the rule.
template <class R>
void free_entry(R *e) noexcept
{
	if (!e)
		return;
	std::free(e->name);
	std::free(e);
}

// Copies every field but `name` from one record to another of the same
// database (narrow or wide, either direction). `name` is left untouched.
template <class To, class From>
void copy_fields(To &to, const From &from) noexcept
{
	if constexpr (std::is_same_v<From, macent_t> || std::is_same_v<From, wcmacent_t>) {
		to.lev1 = from.lev1;
		to.cat1 = from.cat1;
		to.lev2 = from.lev2;
		to.cat2 = from.cat2;
	} else {
		to.value = from.value;
	}
}

// A new uninitialised record from malloc, as the stream readers and the
// copies made for back-ends use.
template <class R>
R *alloc_entry() noexcept
{
	return static_cast<R *>(std::malloc(sizeof(R)));
}

} // namespace vyr::namedb
