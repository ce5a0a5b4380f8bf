// Use counts of one label changed from several threads at once: no update
// is lost, and the last reference dropped, on whichever thread, frees the
// record exactly once.  Run under ThreadSanitizer by `scripts/test --tsan`
// (label `threads`), where it also proves the counts free of data races.
#include "label/label_test_util.hh"

#include <atomic>
#include <thread>
#include <vector>

using namespace label_test;
using vyr_test::FailAlloc;

namespace {

TEST(LabelRecordsThreads, ConcurrentGetPutCountsExactlyAndFreesOnce)
{
	constexpr int kThreads = 4;
	constexpr int kRounds = 50000;
	vyrl_t *l = nullptr;
	EXPECT_EQ(blocks_left_by([&] { l = vyrl_get_new(); }), 3u);
	ASSERT_NE(l, nullptr);

	// Runs body on every thread at once: the threads wait at a gate so
	// that their loops overlap instead of running one after the other.
	auto run_together = [](auto body) {
		std::atomic<bool> go{false};
		std::vector<std::thread> threads;
		for (int t = 0; t < kThreads; ++t)
			threads.emplace_back([&] {
				while (!go.load())
					std::this_thread::yield();
				body();
			});
		go.store(true);
		for (auto &th : threads)
			th.join();
	};

	// Phase 1: concurrent gets, then concurrent puts; no update may be
	// lost.  A lost update needs two threads inside one update at the same
	// moment, so the phase is repeated to give a broken count a fair chance
	// to show.
	for (int rep = 0; rep < 4; ++rep) {
		run_together([l] {
			for (int k = 0; k < kRounds; ++k)
				vyrl_get(l);
		});
		ASSERT_EQ(vyrl_ucnt(l), 1 + int64_t{kThreads} * kRounds);
		run_together([l] {
			for (int k = 0; k < kRounds; ++k)
				vyrl_put(l);
		});
		ASSERT_EQ(vyrl_ucnt(l), 1);
	}

	// Phase 2: each thread owns one reference, churns get/put pairs and
	// then drops its reference; the creator's reference is dropped first.
	// The record must be freed exactly once, by whichever thread is last.
	for (int t = 0; t < kThreads; ++t)
		vyrl_get(l);
	vyrl_put(l);
	run_together([l] {
		for (int k = 0; k < kRounds; ++k)
			vyrl_put(vyrl_get(l));
		vyrl_put(l);
	});
	EXPECT_EQ(FailAlloc::live(), 0u);
	FailAlloc::reset();
}

} // namespace
