// Interposed malloc, calloc, realloc and free for allocation-failure tests.
//
// The definitions here take precedence over libc's for the whole process
// (the program comes first in the dynamic linker's lookup order), and each
// forwards to the next definition: libc's, or a sanitizer's when the tests
// are built with one. Looking that definition up with dlsym may itself
// allocate, so the first few blocks come from a small static arena.
#include "support/failalloc.h"

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <dlfcn.h>
#include <mutex>

namespace {

using malloc_fn = void *(*)(size_t);
using calloc_fn = void *(*)(size_t, size_t);
using realloc_fn = void *(*)(void *, size_t);
using free_fn = void (*)(void *);

malloc_fn real_malloc;
calloc_fn real_calloc;
realloc_fn real_realloc;
free_fn real_free;

// Arena for allocations made while the real functions are being looked up.
alignas(16) unsigned char arena[8192];
size_t arena_used;
bool resolving;

bool in_arena(const void *p)
{
	auto *b = static_cast<const unsigned char *>(p);
	return b >= arena && b < arena + sizeof arena;
}

void *arena_alloc(size_t size)
{
	size = (size + 15) & ~size_t{15};
	if (arena_used + size > sizeof arena)
		return nullptr;
	void *p = arena + arena_used;
	arena_used += size;
	return p;
}

void resolve()
{
	if (real_malloc || resolving)
		return;
	resolving = true;
	real_calloc = reinterpret_cast<calloc_fn>(dlsym(RTLD_NEXT, "calloc"));
	real_realloc = reinterpret_cast<realloc_fn>(dlsym(RTLD_NEXT, "realloc"));
	real_free = reinterpret_cast<free_fn>(dlsym(RTLD_NEXT, "free"));
	real_malloc = reinterpret_cast<malloc_fn>(dlsym(RTLD_NEXT, "malloc"));
	resolving = false;
	if (!real_malloc || !real_calloc || !real_realloc || !real_free)
		abort();
}

std::atomic<long> countdown{0};  // > 0: allocations left until the failure
std::atomic<bool> injected{false};
std::atomic<bool> tracking{false};
std::atomic<long> seen{0};

// Open-addressing set of the blocks handed out while tracking. Small and
// lock-protected: the tests that use it are single-threaded hot loops of a
// few thousand allocations at most.
constexpr size_t kSlots = 1u << 16;
uintptr_t slots[kSlots];
constexpr uintptr_t kTomb = 1;
size_t nlive;
bool slots_dirty;  // whether reset() has anything to clear

// A spin lock rather than a mutex: free() can run during a sanitizer's own
// start-up, before the threading interceptors exist.
struct SpinLock {
	std::atomic_flag flag = ATOMIC_FLAG_INIT;
	void lock() { while (flag.test_and_set(std::memory_order_acquire)) {} }
	void unlock() { flag.clear(std::memory_order_release); }
};
SpinLock slots_mu;
using Guard = std::lock_guard<SpinLock>;

size_t slot_of(uintptr_t p) { return (p >> 4) * 0x9E3779B97F4A7C15ull >> 48; }

void remember(void *p)
{
	Guard g(slots_mu);
	auto key = reinterpret_cast<uintptr_t>(p);
	for (size_t i = slot_of(key), probes = 0; probes < kSlots; i = (i + 1) % kSlots, ++probes) {
		if (slots[i] == 0 || slots[i] == kTomb) {
			slots[i] = key;
			++nlive;
			slots_dirty = true;
			return;
		}
	}
	fputs("failalloc: too many live blocks\n", stderr);
	abort();
}

void forget(void *p)
{
	Guard g(slots_mu);
	if (nlive == 0)
		return;
	auto key = reinterpret_cast<uintptr_t>(p);
	for (size_t i = slot_of(key), probes = 0; probes < kSlots && slots[i] != 0; i = (i + 1) % kSlots, ++probes) {
		if (slots[i] == key) {
			slots[i] = kTomb;
			--nlive;
			return;
		}
	}
}

// True when this allocation is the one to fail.
bool should_fail()
{
	if (tracking.load(std::memory_order_relaxed) || countdown.load(std::memory_order_relaxed) > 0)
		seen.fetch_add(1, std::memory_order_relaxed);
	long left = countdown.load(std::memory_order_relaxed);
	while (left > 0) {
		if (countdown.compare_exchange_weak(left, left - 1)) {
			if (left == 1) {
				injected.store(true);
				return true;
			}
			return false;
		}
	}
	return false;
}

void *note(void *p)
{
	if (p && tracking.load(std::memory_order_relaxed))
		remember(p);
	return p;
}

} // namespace

extern "C" {

void *malloc(size_t size)
{
	if (!real_malloc) {
		if (resolving)
			return arena_alloc(size);
		resolve();
	}
	if (should_fail()) {
		errno = ENOMEM;
		return nullptr;
	}
	return note(real_malloc(size));
}

void *calloc(size_t n, size_t size)
{
	if (!real_calloc) {
		if (resolving) {
			void *p = arena_alloc(n * size);
			if (p)
				memset(p, 0, n * size);
			return p;
		}
		resolve();
	}
	if (should_fail()) {
		errno = ENOMEM;
		return nullptr;
	}
	return note(real_calloc(n, size));
}

void *realloc(void *old, size_t size)
{
	if (!real_realloc)
		resolve();
	if (old && in_arena(old)) {
		void *p = malloc(size);
		if (p)
			memcpy(p, old, std::min<size_t>(size, arena + sizeof arena - static_cast<unsigned char *>(old)));
		return p;
	}
	if (should_fail()) {
		errno = ENOMEM;
		return nullptr;
	}
	void *p = real_realloc(old, size);
	if (p) {
		if (old)
			forget(old);
		note(p);
	}
	return p;
}

void free(void *p)
{
	if (!p || in_arena(p))
		return;
	if (!real_free)
		resolve();
	forget(p);
	real_free(p);
}

} // extern "C"

namespace vyr_test {

void FailAlloc::arm(long n)
{
	injected.store(false);
	countdown.store(n);
}

bool FailAlloc::fired() { return injected.load(); }

void FailAlloc::track(bool on) { tracking.store(on); }

std::size_t FailAlloc::live()
{
	Guard g(slots_mu);
	return nlive;
}

void FailAlloc::reset()
{
	Guard g(slots_mu);
	if (slots_dirty)
		memset(slots, 0, sizeof slots);
	slots_dirty = false;
	nlive = 0;
	seen.store(0);
}

long FailAlloc::count() { return seen.load(); }

} // namespace vyr_test
