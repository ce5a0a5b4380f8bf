// The static-result interface: one hidden handle per database and one
// static record with a 1024-byte name buffer per entry-returning function.
//
// Not safe for threads. A family's handle is held from a successful
// set*ent (or the first get*ent) until end*ent; lookups and writers share a
// held handle and otherwise open and close one for their own call.

#include <vyr/namedb.h>

#include "namedb/entries.hh"
#include "namedb/families.hh"

#include <cerrno>
#include <cstring>

namespace vyr::namedb {
namespace {

constexpr size_t kNameBuf = 1024;

template <class F>
struct Held {
	static inline void *handle = nullptr;
};

// Which function a static result belongs to; no two functions share one.
enum Which { kWalk, kStream, kByName, kByKey };

template <class E, Which W>
struct Result {
	static inline E rec{};
	static inline char name[kNameBuf]{};
};

// Moves a record into the function's static result and releases it. A name
// longer than the buffer is cut to its first 1023 bytes.
template <Which W, class E>
E *fill(E *e) noexcept
{
	using R = Result<E, W>;
	copy_fields(R::rec, *e);
	if (e->name) {
		const size_t n = strnlen(e->name, kNameBuf - 1);
		std::memcpy(R::name, e->name, n);
		R::name[n] = '\0';
		R::rec.name = R::name;
	} else {
		R::rec.name = nullptr;
	}
	free_entry(e);
	return &R::rec;
}

template <Which W, class E>
E *fill_or_null(E *e) noexcept
{
	return e ? fill<W>(e) : nullptr;
}

template <class F>
int start_walk() noexcept
{
	void *h = F::open();
	Held<F>::handle = h;
	if (!h)
		return -1;
	if (F::set(h) >= 0)
		return 0;
	F::close(h);
	Held<F>::handle = nullptr;
	return -1;
}

template <class F>
int end_walk() noexcept
{
	void *h = Held<F>::handle;
	F::end(h);
	const int r = F::close(h);
	Held<F>::handle = nullptr;
	return r;
}

// The end of a walk keeps the handle: only end_walk releases it.
template <class F>
typename F::Entry *next_entry() noexcept
{
	if (!Held<F>::handle && start_walk<F>() != 0)
		return nullptr;
	return fill_or_null<kWalk>(F::getent(Held<F>::handle));
}

// Runs call(handle) on the held handle, or on one opened and closed for
// this call alone; `fail` if that open fails. The call's errno survives a
// successful close.
template <class F, class R, class Call>
R on_handle(R fail, Call &&call) noexcept
{
	if (void *h = Held<F>::handle)
		return call(h);
	void *h = F::open();
	Held<F>::handle = h;
	if (!h)
		return fail;
	const R r = call(h);
	const int saved = errno;
	if (F::close(h) == 0)
		errno = saved;
	Held<F>::handle = nullptr;
	return r;
}

template <class F>
typename F::Entry *by_name(const char *name) noexcept
{
	using E = typename F::Entry;
	return fill_or_null<kByName>(on_handle<F, E *>(nullptr, [name](void *h) { return F::getnam(h, name); }));
}

template <class F>
typename F::Entry *by_key(typename F::Key key) noexcept
{
	using E = typename F::Entry;
	return fill_or_null<kByKey>(on_handle<F, E *>(nullptr, [key](void *h) { return F::getkey(h, key); }));
}

template <class F>
int put(const typename F::Entry *e) noexcept
{
	return on_handle<F, int>(-1, [e](void *h) { return F::put(h, e); });
}

template <class F>
int remove_name(const char *name) noexcept
{
	return on_handle<F, int>(-1, [name](void *h) { return F::rmnam(h, name); });
}

template <class F>
int remove_key(typename F::Key key) noexcept
{
	return on_handle<F, int>(-1, [key](void *h) { return F::rmkey(h, key); });
}

template <class F>
typename F::Entry *read_stream(FILE *fp) noexcept
{
	return fill_or_null<kStream>(F::fget(fp));
}

} // namespace
} // namespace vyr::namedb

using namespace vyr::namedb;

extern "C" {

int setmacent(void) noexcept { return start_walk<MacFamily>(); }
int setlevent(void) noexcept { return start_walk<LevFamily>(); }
int setcatent(void) noexcept { return start_walk<CatFamily>(); }

int endmacent(void) noexcept { return end_walk<MacFamily>(); }
int endlevent(void) noexcept { return end_walk<LevFamily>(); }
int endcatent(void) noexcept { return end_walk<CatFamily>(); }

macent_t *getmacent(void) noexcept { return next_entry<MacFamily>(); }
levent_t *getlevent(void) noexcept { return next_entry<LevFamily>(); }
catent_t *getcatent(void) noexcept { return next_entry<CatFamily>(); }

macent_t *fgetmacent(FILE *fp) noexcept { return read_stream<MacFamily>(fp); }
levent_t *fgetlevent(FILE *fp) noexcept { return read_stream<LevFamily>(fp); }
catent_t *fgetcatent(FILE *fp) noexcept { return read_stream<CatFamily>(fp); }

macent_t *getmacnam(const char *name) noexcept { return by_name<MacFamily>(name); }
levent_t *getlevnam(const char *name) noexcept { return by_name<LevFamily>(name); }
catent_t *getcatnam(const char *name) noexcept { return by_name<CatFamily>(name); }

macent_t *getmacuid(uint32_t uid) noexcept { return by_key<MacFamily>(uid); }
levent_t *getlevval(int value) noexcept { return by_key<LevFamily>(value); }
catent_t *getcatval(uint64_t value) noexcept { return by_key<CatFamily>(value); }

int putmacent(const macent_t *ent) noexcept { return put<MacFamily>(ent); }
int putcatent(const catent_t *ent) noexcept { return put<CatFamily>(ent); }
int putlevent(const levent_t *ent) noexcept
{
	// Unlike its twins, the level writer reports success as 0.
	const int r = put<LevFamily>(ent);
	return r >= 0 ? 0 : -1;
}

int rmmacnam(const char *name) noexcept { return remove_name<MacFamily>(name); }
int rmlevnam(const char *name) noexcept { return remove_name<LevFamily>(name); }
int rmcatnam(const char *name) noexcept { return remove_name<CatFamily>(name); }

int rmlevval(int value) noexcept { return remove_key<LevFamily>(value); }
int rmcatval(uint64_t value) noexcept { return remove_key<CatFamily>(value); }

int fputmacent(FILE *fp, const macent_t *ent) noexcept { return fputmacent_r(fp, ent); }
int fputlevent(FILE *fp, const levent_t *ent) noexcept { return fputlevent_r(fp, ent); }
int fputcatent(FILE *fp, const catent_t *ent) noexcept { return fputcatent_r(fp, ent); }

} // extern "C"
