// The wide-character interface: the handle-based functions with wide names
// in and out. Records cross this layer as copies; a name that can't be
// converted travels as NULL and the layer below decides what that means.

#include <vyr/namedb.h>

#include "contract/tavrel_aux.h"
#include "namedb/entries.hh"
#include "namedb/families.hh"

#include <cerrno>
#include <cstdlib>

namespace vyr::namedb {
namespace {

// Wide copy of a record from the layer below, which is released either way.
template <class E>
wide_t<E> *widen(E *e) noexcept
{
	if (!e)
		return nullptr;
	auto *w = alloc_entry<wide_t<E>>();
	if (w) {
		copy_fields(*w, *e);
		w->name = e->name ? zenk_string_towc(e->name) : nullptr;
	}
	free_entry(e);
	return w;
}

// Narrow copy of a caller's wide record; NULL only without memory.
template <class E>
E *narrow(const wide_t<E> &w) noexcept
{
	E *e = alloc_entry<E>();
	if (!e)
		return nullptr;
	copy_fields(*e, w);
	e->name = w.name ? zenk_string_fromwc(w.name) : nullptr;
	return e;
}

// A wide name as a narrow string for the duration of one call. A failed
// conversion yields NULL, which the functions below refuse.
struct NarrowName {
	char *text;
	explicit NarrowName(const wchar_t *name) noexcept : text(name ? zenk_string_fromwc(name) : nullptr) {}
	~NarrowName() { std::free(text); }
	NarrowName(const NarrowName &) = delete;
	NarrowName &operator=(const NarrowName &) = delete;
};

template <class F>
wide_t<typename F::Entry> *by_name(void *db, const wchar_t *name) noexcept
{
	const NarrowName n(name);
	return widen(F::getnam(db, n.text));
}

template <class F>
int remove_name(void *db, const wchar_t *name) noexcept
{
	const NarrowName n(name);
	return F::rmnam(db, n.text);
}

// Hands a narrow copy of `w` to `write` (a put or a stream write). Nothing
// is written for a NULL record or without memory for the copy: 0.
template <class F, class Target, class Write>
int write_wide(Target target, const wide_t<typename F::Entry> *w, Write write) noexcept
{
	if (!w)
		return 0;
	auto *e = narrow<typename F::Entry>(*w);
	if (!e)
		return 0;
	const int r = write(target, e);
	free_entry(e);
	return r;
}

template <class W>
int release(W *w) noexcept
{
	if (!w) {
		errno = EINVAL;
		return -1;
	}
	free_entry(w);
	return 0;
}

} // namespace
} // namespace vyr::namedb

using namespace vyr::namedb;

extern "C" {

int wcsetmacent(void *db) noexcept { return setmacent_r(db); }
int wcsetlevent(void *db) noexcept { return setlevent_r(db); }
int wcsetcatent(void *db) noexcept { return setcatent_r(db); }

int wcendmacent(void *db) noexcept { return endmacent_r(db); }
int wcendlevent(void *db) noexcept { return endlevent_r(db); }
int wcendcatent(void *db) noexcept { return endcatent_r(db); }

wcmacent_t *wcgetmacent(void *db) noexcept { return widen(getmacent_r(db)); }
wclevent_t *wcgetlevent(void *db) noexcept { return widen(getlevent_r(db)); }
wccatent_t *wcgetcatent(void *db) noexcept { return widen(getcatent_r(db)); }

wcmacent_t *wcfgetmacent(FILE *fp) noexcept { return widen(fgetmacent_r(fp)); }
wclevent_t *wcfgetlevent(FILE *fp) noexcept { return widen(fgetlevent_r(fp)); }
wccatent_t *wcfgetcatent(FILE *fp) noexcept { return widen(fgetcatent_r(fp)); }

wcmacent_t *wcgetmacuid(void *db, uint32_t uid) noexcept { return widen(getmacuid_r(db, uid)); }
wclevent_t *wcgetlevval(void *db, int value) noexcept { return widen(getlevval_r(db, value)); }
wccatent_t *wcgetcatval(void *db, uint64_t value) noexcept { return widen(getcatval_r(db, value)); }

wcmacent_t *wcgetmacnam(void *db, const wchar_t *name) noexcept { return by_name<MacFamily>(db, name); }
wclevent_t *wcgetlevnam(void *db, const wchar_t *name) noexcept { return by_name<LevFamily>(db, name); }
wccatent_t *wcgetcatnam(void *db, const wchar_t *name) noexcept { return by_name<CatFamily>(db, name); }

int wcrmmacnam(void *db, const wchar_t *name) noexcept { return remove_name<MacFamily>(db, name); }
int wcrmlevnam(void *db, const wchar_t *name) noexcept { return remove_name<LevFamily>(db, name); }
int wcrmcatnam(void *db, const wchar_t *name) noexcept { return remove_name<CatFamily>(db, name); }

int wcrmlevval(void *db, int value) noexcept { return rmlevval_r(db, value); }
int wcrmcatval(void *db, uint64_t value) noexcept { return rmcatval_r(db, value); }

int wcputmacent(void *db, const wcmacent_t *ent) noexcept { return write_wide<MacFamily>(db, ent, putmacent_r); }
int wcputlevent(void *db, const wclevent_t *ent) noexcept { return write_wide<LevFamily>(db, ent, putlevent_r); }
int wcputcatent(void *db, const wccatent_t *ent) noexcept { return write_wide<CatFamily>(db, ent, putcatent_r); }

int wcfputmacent(FILE *fp, const wcmacent_t *ent) noexcept { return write_wide<MacFamily>(fp, ent, fputmacent_r); }
int wcfputlevent(FILE *fp, const wclevent_t *ent) noexcept { return write_wide<LevFamily>(fp, ent, fputlevent_r); }
int wcfputcatent(FILE *fp, const wccatent_t *ent) noexcept { return write_wide<CatFamily>(fp, ent, fputcatent_r); }

int wcfreemacent(wcmacent_t *ent) noexcept { return release(ent); }
int wcfreelevent(wclevent_t *ent) noexcept { return release(ent); }
int wcfreecatent(wccatent_t *ent) noexcept { return release(ent); }

} // extern "C"
