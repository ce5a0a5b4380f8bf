// Threads sharing labels as readers (decisions, text, name lookups, kernel
// reads, use counts taken and dropped) while a writer replaces the level file
// under the files back-end's cache: each must repeat the main thread's
// answers, and under ThreadSanitizer (label `threads`) the use counts, the
// started database switch and the file cache must show no data race.
#include <vyr/kernel.h>
#include <vyr/label.h>
#include <vyr/namedb.h>
#include <vyr/text.h>

#include "hardening/files_db.hh"
#include "support/labels.hh"

#include <atomic>
#include <cstdlib>
#include <cstring>
#include <string>
#include <thread>
#include <vector>

namespace hardening {
namespace {

constexpr int kThreads = 4;
constexpr int kRounds = 300;

using vyr_test::Label;

std::string take(char *s)
{
	std::string out = s ? s : "(null)";
	std::free(s);
	return out;
}

// Everything one round of a reader computes from the two shared labels.
struct Answers {
	int decisions[7];
	std::string named, numeric, subject, raw, file_raw;
	uint8_t lev = 0;
	uint64_t cat = 0;
	bool operator==(const Answers &) const = default;
};

Answers compute(vyrl_t *subject, vyrl_t *object, const std::string &file)
{
	// Extra references held while reading, as a thread sharing a label would.
	const Label s(vyrl_get(subject)), o(vyrl_get(object));
	Answers a{{vyrl_permission(s.get(), o.get(), VYR_REQ_READ), vyrl_permission(s.get(), o.get(), VYR_REQ_WRITE),
	           vyrl_permission(s.get(), o.get(), VYR_REQ_READ | VYR_REQ_WRITE),
	           vyrl_permission(s.get(), o.get(), VYR_REQ_EXEC), vyrl_cmp(s.get(), o.get(), 0),
	           vyrl_notg(s.get(), o.get()), vyr_child_parent(o.get(), s.get())},
	          take(vyrl_get_text(o.get(), 0)), take(vyrl_get_text(o.get(), VYR_TEXT_NUMERIC)),
	          take(vyrl_asprintf(s.get(), "%l/%c")), vyr_test::raw_bytes(o.get()), ""};
	if (!file.empty())
		a.file_raw = vyr_test::raw_bytes(Label(vyr_get_path(file.c_str())).get());
	vyr_lev_from_text("secret", &a.lev);
	vyr_cat_from_text("finance,ops", &a.cat);
	return a;
}

class SharedLabels : public ::testing::Test {
protected:
	void SetUp() override
	{
		// Before the first database call or opening of the service channel.
		::setenv("VYR_TAVREL_XATTR_NS", "user", 1);
		::setenv("VYR_TAVREL_STATE_DIR", scratch_db("state").c_str(), 1);
		subject_.reset(vyrl_get_from_text("top:1:finance,human:ccnr!9,4:2"));
		object_.reset(vyrl_get_from_text("secret:0:finance:0!9:No"));
		ASSERT_TRUE(subject_ && object_);
		// A blob too, so that text, raw form and drops walk every part.
		object_->ml->blob = static_cast<unsigned char *>(std::memcpy(std::malloc(5), "\1\2\3\4\5", 5));
		object_->ml->blob_size = 5;
	}
	Label subject_, object_;
};

TEST_F(SharedLabels, ReadersAgreeWithTheSingleThreadedAnswers)
{
	std::string file = scratch_db("labelled");
	install_file(file, "");
	if (vyr_set_path(file.c_str(), object_.get()) != 0)
		file.clear(); // no user.* attributes here: no kernel reads
	// Starts the databases: that must end before a second thread enters.
	const Answers expected = compute(subject_.get(), object_.get(), file);
	ASSERT_EQ(expected.named, "secret:Low:finance:0x0!9:No");
	ASSERT_EQ(expected.lev, 3);
	ASSERT_EQ(expected.cat, 0x100000008u);
	ASSERT_EQ(expected.file_raw, file.empty() ? "" : expected.raw);

	std::atomic<int> mismatches{0}, writes{0};
	std::atomic<bool> done{false};
	// Each rewrite is a new file: readers keep replacing the cached parse.
	std::thread writer([&] {
		const levent_t same{const_cast<char *>("top"), 200};
		while (!done.load()) {
			if (void *db = openlevdb_r()) {
				writes += putlevent_r(db, &same) == 0;
				closelevdb_r(db);
			}
		}
	});
	std::vector<std::thread> readers;
	for (int t = 0; t < kThreads; ++t)
		readers.emplace_back([&] {
			for (int r = 0; r < kRounds; ++r)
				mismatches += !(compute(subject_.get(), object_.get(), file) == expected);
		});
	for (std::thread &t : readers)
		t.join();
	done = true;
	writer.join();
	EXPECT_EQ(mismatches.load(), 0);
	EXPECT_GT(writes.load(), 0);
	EXPECT_EQ(read_file(scratch_db("levels")), kLevels);
	EXPECT_TRUE(vyrl_ucnt(subject_.get()) == 1 && vyrl_ucnt(object_.get()) == 1 && vyrml_ucnt(object_->ml) == 1);
}

// The last of concurrent drops frees the label once (the sanitizers see a
// double or missing free); a part another holder shares outlives it.
TEST_F(SharedLabels, LastOfConcurrentDropsFreesOnce)
{
	for (int round = 0; round < 50; ++round) {
		vyrl_t *l = vyrl_dup(object_.get());
		ASSERT_NE(l, nullptr);
		for (int t = 1; t < kThreads; ++t)
			vyrl_get(l);
		const vyr_test::MlRef ml(vyrml_get(l->ml));
		std::vector<std::thread> droppers;
		for (int t = 0; t < kThreads; ++t)
			droppers.emplace_back([l] { vyrl_put(l); });
		for (std::thread &t : droppers)
			t.join();
		EXPECT_EQ(vyrml_ucnt(ml.get()), 1);
		EXPECT_EQ(ml->blob_size, 5u);
	}
}

} // namespace
} // namespace hardening
