// Allocation-failure injection for tests.
//
// Test programs that link vyr_testsupport replace malloc, calloc and realloc
// with thin wrappers over the real allocator (the next definition in the
// lookup order: libc's, or a sanitizer's). While a call runs under
// Injector::run(), the wrappers count allocations, fail the chosen one with
// ENOMEM, and remember every block handed out so that a test can tell which
// of them are still alive afterwards.
//
// Typical use: every allocation of the call under test fails once in turn.
//
//   vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
//       vyrl_t *copy = inj.run([&] { return vyrl_dup(src); });
//       if (inj.fired()) { EXPECT_EQ(copy, nullptr); return; }
//       ASSERT_NE(copy, nullptr);
//       vyrl_put(copy);
//   });
//
// After each attempt the sweep checks that no block allocated inside run()
// is still alive, so the lambda must release whatever the call returned. The
// sweep stops after the first attempt in which no failure was injected, i.e.
// once the call completed with every allocation succeeding.
#pragma once

#include <cstddef>
#include <utility>

#include <gtest/gtest.h>

namespace vyr_test {

struct FailAlloc {
	// The n-th allocation from now (1-based) fails, once; 0 disarms.
	static void arm(long n);
	static void disarm() { arm(0); }
	// Whether the armed failure has been injected since the last arm().
	static bool fired();
	// Start or stop recording the blocks handed out (frees are always seen).
	static void track(bool on);
	// Blocks recorded while tracking that have not been freed yet.
	static std::size_t live();
	// Forget every recorded block.
	static void reset();
	// Allocations seen while armed or tracking, since the last reset().
	static long count();
};

class Injector {
public:
	explicit Injector(long n) : n_(n) {}

	// Runs fn with the failure armed and allocations tracked; returns its result.
	template <class F>
	auto run(F &&fn) -> decltype(fn())
	{
		struct Window {
			Injector &self;
			explicit Window(Injector &s) : self(s) { FailAlloc::track(true); FailAlloc::arm(self.n_); }
			~Window() { self.fired_ = FailAlloc::fired(); FailAlloc::disarm(); FailAlloc::track(false); }
		} window(*this);
		return std::forward<F>(fn)();
	}

	bool fired() const { return fired_; }
	long n() const { return n_; }

private:
	long n_;
	bool fired_ = false;
};

// Runs attempt(Injector&) with n = 1, 2, ... until an attempt in which no
// failure was injected; checks after every attempt that nothing allocated
// inside run() is still alive. Returns the number of attempts.
template <class F>
long sweep_alloc_failures(F &&attempt, long max_attempts = 100000)
{
	long n = 1;
	for (; n <= max_attempts; ++n) {
		FailAlloc::reset();
		Injector inj(n);
		attempt(inj);
		EXPECT_EQ(FailAlloc::live(), 0u) << "blocks leaked when allocation " << n << " failed";
		if (!inj.fired())
			break;
		if (::testing::Test::HasFatalFailure())
			break;
	}
	FailAlloc::reset();
	EXPECT_LE(n, max_attempts) << "allocation sweep did not finish";
	return n;
}

} // namespace vyr_test
