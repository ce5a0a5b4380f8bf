// Internal helpers of the label core: use-count primitives, owning smart
// pointers over malloc'ed memory and label records, role-entry helpers.
//
// Nothing here throws: every helper is noexcept and built from operations
// that cannot fail except through the allocator, whose failure is reported
// as a null pointer.
#pragma once

#include <vyr/label.h>

#include <atomic>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <new>
#include <utility>

namespace vyr::label {

// ---- Use counts -----------------------------------------------------------
//
// Invariant: a record's ucnt is the number of references held to it; the
// record is released by exactly the one caller whose decrement reaches 0.
// All three record types keep ucnt as an int32_t at a naturally aligned
// offset, so std::atomic_ref applies to it directly.

template <class Rec>
inline void take_ref(Rec *rec) noexcept
{
	std::atomic_ref<int32_t>(rec->ucnt).fetch_add(1, std::memory_order_seq_cst);
}

// Returns true when this call dropped the last reference.  A compare-and-
// swap loop rather than fetch_sub: on a lost race the value found is retried,
// so the thread whose swap stored 0 is the single one that frees.
template <class Rec>
[[nodiscard]] inline bool drop_ref(Rec *rec) noexcept
{
	std::atomic_ref<int32_t> cnt(rec->ucnt);
	int32_t seen = cnt.load(std::memory_order_seq_cst);
	while (!cnt.compare_exchange_weak(seen, seen - 1, std::memory_order_seq_cst,
	                                  std::memory_order_seq_cst)) {
	}
	return seen - 1 == 0;
}

// ---- Owning pointers --------------------------------------------------------

struct FreeDeleter {
	void operator()(void *p) const noexcept { std::free(p); }
};

// Memory from malloc/calloc, released with free.
template <class T>
using c_ptr = std::unique_ptr<T, FreeDeleter>;

// One reference to a label record, dropped with the matching put.
struct PutDeleter {
	void operator()(vyrl_t *l) const noexcept { vyrl_put(l); }
	void operator()(vyrml_t *m) const noexcept { vyrml_put(m); }
	void operator()(vyrrl_t *r) const noexcept { vyrrl_put(r); }
};

template <class Rec>
using ref_ptr = std::unique_ptr<Rec, PutDeleter>;

// A zero-filled record with use count 1, or null.  Zero filling gives every
// count 0 and every pointer NULL, which is the empty state of each record.
template <class Rec>
inline Rec *new_record() noexcept
{
	auto *rec = static_cast<Rec *>(std::calloc(1, sizeof(Rec)));
	if (rec)
		rec->ucnt = 1;
	return rec;
}

// Hands out a label over two complete parts, or null if any piece is
// missing; the owning pointers then release what was built.  This is the
// single place where a vyrl_t is completed, which keeps the invariant that
// no label ever leaves a constructor with a NULL ml or rl.
inline vyrl_t *assemble(c_ptr<vyrl_t> shell, ref_ptr<vyrml_t> ml, ref_ptr<vyrrl_t> rl) noexcept
{
	if (!shell || !ml || !rl)
		return nullptr;
	shell->ml = ml.release();
	shell->rl = rl.release();
	return shell.release();
}

// ---- Role entries -------------------------------------------------------------

// Bytes of n entries in memory; no overflow test (n is at most 32 bits wide
// at every call site that allocates).
constexpr uint64_t roles_bytes(uint64_t n) noexcept { return n * sizeof(vyr_role_t); }
static_assert(sizeof(vyr_role_t) == 16);

// Uninitialised room for n entries (n may be 0), or null.
inline vyr_role_t *alloc_roles(uint64_t n) noexcept
{
	return static_cast<vyr_role_t *>(std::malloc(roles_bytes(n)));
}

// Block copy of n entries, padding bytes included.
inline void copy_roles(vyr_role_t *dst, const vyr_role_t *src, uint64_t n) noexcept
{
	if (n != 0)
		std::memcpy(dst, src, roles_bytes(n));
}

} // namespace vyr::label
