// Use counts of one label changed from several threads at once: no update is
// lost, and the last reference dropped, on whichever thread, frees the record
// exactly once.  Runs under ThreadSanitizer (label `threads`), which also
// proves the counts free of data races.
#include "label/label_test_util.hh"

#include <atomic>
#include <thread>
#include <vector>

using namespace label_test;

namespace {

constexpr int kThreads = 4, kRounds = 50000;

// Runs body on every thread at once: a gate makes the loops overlap.
template <class F> void run_together(F body)
{
	std::atomic<bool> go{false};
	std::vector<std::thread> threads;
	for (int t = 0; t < kThreads; ++t)
		threads.emplace_back([&] {
			while (!go.load())
				std::this_thread::yield();
			for (int k = 0; k < kRounds; ++k)
				body(k);
		});
	go.store(true);
	for (auto &th : threads)
		th.join();
}

TEST(LabelRecordsThreads, ConcurrentGetPutCountsExactlyAndFreesOnce)
{
	vyrl_t *l = nullptr;
	EXPECT_EQ(blocks_left_by([&] { l = vyrl_get_new(); }), 3u);
	// A lost update needs two threads inside one update at once: repeat to give it a chance.
	for (int rep = 0; rep < 4; ++rep) {
		run_together([l](int) { vyrl_get(l); });
		ASSERT_EQ(vyrl_ucnt(l), 1 + int64_t{kThreads} * kRounds);
		run_together([l](int) { vyrl_put(l); });
		ASSERT_EQ(vyrl_ucnt(l), 1);
	}
	// Each thread owns one reference (the creator's is dropped first), churns
	// get/put pairs, then drops it: freed exactly once, by the last thread.
	for (int t = 0; t < kThreads; ++t)
		vyrl_get(l);
	vyrl_put(l);
	run_together([l](int k) {
		vyrl_put(vyrl_get(l));
		if (k == kRounds - 1)
			vyrl_put(l);
	});
	EXPECT_EQ(vyr_test::FailAlloc::live(), 0u);
	vyr_test::FailAlloc::reset();
}

} // namespace
