// Interposed malloc, calloc, realloc and free for allocation-failure tests.
//
// The definitions here take precedence over libc's for the whole process
// (the program comes first in the dynamic linker's lookup order), and each
// forwards to the next definition: libc's, or a sanitizer's when the tests
// are built with one. Looking that definition up with dlsym may itself
// allocate, so the first few blocks come from a small static arena.
#include "support/failalloc.h"

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <dlfcn.h>

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

// Shared state, touched only through the compiler's __atomic built-ins: these
// are always inlined, whereas std::atomic's members are out-of-line calls in
// unoptimised builds, and a sanitizer's start-up may reach malloc before such
// (instrumented) code can run.
long countdown;  // > 0: allocations left until the failure
bool injected;
bool tracking;
long seen;

template <class T>
T load(const T &v) { return __atomic_load_n(&v, __ATOMIC_SEQ_CST); }
template <class T>
void store(T &v, T x) { __atomic_store_n(&v, x, __ATOMIC_SEQ_CST); }

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
bool slots_locked;
struct Guard {
	Guard() { while (__atomic_test_and_set(&slots_locked, __ATOMIC_ACQUIRE)) {} }
	~Guard() { __atomic_clear(&slots_locked, __ATOMIC_RELEASE); }
	Guard(const Guard &) = delete;
	Guard &operator=(const Guard &) = delete;
};

size_t slot_of(uintptr_t p) { return (p >> 4) * 0x9E3779B97F4A7C15ull >> 48; }

void remember(void *p)
{
	Guard g;
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
	Guard g;
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
	if (load(tracking) || load(countdown) > 0)
		__atomic_fetch_add(&seen, 1, __ATOMIC_RELAXED);
	long left = load(countdown);
	while (left > 0) {
		if (__atomic_compare_exchange_n(&countdown, &left, left - 1, true, __ATOMIC_SEQ_CST, __ATOMIC_SEQ_CST)) {
			if (left == 1) {
				store(injected, true);
				return true;
			}
			return false;
		}
	}
	return false;
}

void *note(void *p)
{
	if (p && load(tracking))
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
		size_t room = arena + sizeof arena - static_cast<unsigned char *>(old);
		void *p = malloc(size);
		if (p)
			memcpy(p, old, size < room ? size : room);
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
	store(injected, false);
	store(countdown, n);
}

bool FailAlloc::fired() { return load(injected); }

void FailAlloc::track(bool on) { store(tracking, on); }

std::size_t FailAlloc::live()
{
	Guard g;
	return nlive;
}

void FailAlloc::reset()
{
	Guard g;
	if (slots_dirty)
		memset(slots, 0, sizeof slots);
	slots_dirty = false;
	nlive = 0;
	store(seen, 0L);
}

long FailAlloc::count() { return load(seen); }

} // namespace vyr_test
