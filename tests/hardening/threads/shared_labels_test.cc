// Threads reading shared labels at once: decisions, comparisons, raw and
// text output (with names from the files back-end), name lookups, and the
// use counts of the shared records taken and dropped all the while; a
// writer thread keeps replacing the level file under the back-end's cache.
//
// Every answer is computed once on the main thread first; each thread then
// repeats the same calls and must get the same answers. Run under
// ThreadSanitizer (scripts/test --tsan) this also proves the absence of data
// races in the library and in the back-end's file cache.
#include <vyr/kernel.h>
#include <vyr/label.h>
#include <vyr/namedb.h>
#include <vyr/raw.h>
#include <vyr/text.h>

#include "hardening/files_db.hh"
#include "support/labels.hh"

#include <atomic>
#include <cstdlib>
#include <cstring>
#include <memory>
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


std::string level_name(int value)
{
	void *db = openlevdb_r();
	if (db == nullptr)
		return "(no db)";
	levent_t *e = getlevval_r(db, value);
	std::string out = e ? std::string(e->name) : "(none)";
	freelevent_r(e);
	closelevdb_r(db);
	return out;
}

// Everything one round of a reader computes from the two shared labels.
struct Answers {
	int permission[4];
	int equal, notg, child;
	std::string text_named, text_numeric, subject_text, raw, level;
	uint8_t lev_read;
	uint64_t cat_read;

	bool operator==(const Answers &) const = default;
};

constexpr int kRequests[4] = {VYR_REQ_READ, VYR_REQ_WRITE, VYR_REQ_READ | VYR_REQ_WRITE, VYR_REQ_EXEC};

Answers compute(vyrl_t *subject, vyrl_t *object)
{
	Answers a{};
	// Extra references held while reading, as a caller sharing the label
	// with other threads would.
	vyrl_t *s = vyrl_get(subject);
	vyrl_t *o = vyrl_get(object);
	for (int i = 0; i < 4; ++i)
		a.permission[i] = vyrl_permission(s, o, kRequests[i]);
	a.equal = vyrl_cmp(s, o, 0);
	a.notg = vyrl_notg(s, o);
	a.child = vyr_child_parent(o, s);
	a.text_named = take(vyrl_get_text(o, 0));
	a.text_numeric = take(vyrl_get_text(o, VYR_TEXT_NUMERIC));
	a.subject_text = take(vyrl_asprintf(s, "%l/%c"));
	a.raw = vyr_test::raw_bytes(o);
	a.level = level_name(200);
	a.lev_read = 0;
	vyr_lev_from_text("secret", &a.lev_read);
	a.cat_read = 0;
	vyr_cat_from_text("finance,ops", &a.cat_read);
	vyrl_put(o);
	vyrl_put(s);
	return a;
}

class SharedLabels : public ::testing::Test {
protected:
	// One database for the whole process: it must exist before the first
	// database call, and the databases keep their configuration.
	static void SetUpTestSuite()
	{
		db_ = new ScratchDb();
		// Labels of files as user.* attributes, process labels under the
		// scratch directory: read when the service channel first opens.
		::setenv("VYR_TAVREL_XATTR_NS", "user", 1);
		::setenv("VYR_TAVREL_STATE_DIR", db_->path("state").c_str(), 1);
	}
	static void TearDownTestSuite()
	{
		delete db_;
		db_ = nullptr;
	}

	void SetUp() override
	{
		// The object has a blob and roles, so that text, raw form and drops
		// walk every part of it.
		subject_.reset(vyrl_get_from_text("top:1:finance,human:ccnr!9,4:2"));
		object_.reset(vyrl_get_from_text("secret:0:finance:0!9:No"));
		ASSERT_TRUE(subject_ && object_);
		// The records are plain: a blob is a malloc'd buffer they own.
		static const unsigned char blob[] = {1, 2, 3, 4, 5};
		auto *copy = static_cast<unsigned char *>(std::malloc(sizeof blob));
		ASSERT_NE(copy, nullptr);
		std::memcpy(copy, blob, sizeof blob);
		object_->ml->blob = copy;
		object_->ml->blob_size = sizeof blob;
	}

	static ScratchDb *db_;
	Label subject_, object_;
};
ScratchDb *SharedLabels::db_ = nullptr;

TEST_F(SharedLabels, ReadersAgreeWithTheSingleThreadedAnswers)
{
	// The first call into each database starts it; that must finish before
	// other threads enter.
	const Answers expected = compute(subject_.get(), object_.get());
	ASSERT_EQ(expected.text_named, "secret:Low:finance:0x0!9:No");
	ASSERT_EQ(expected.level, "top");
	ASSERT_EQ(expected.lev_read, 3);
	ASSERT_EQ(expected.cat_read, 0x100000008u);

	std::atomic<int> mismatches{0}, writes{0};
	std::atomic<bool> go{false}, done{false};
	// A writer rewrites the level file with the same entries all the while:
	// every rewrite is a new file to the back-end, so readers keep missing
	// its cache and replacing the cached parse under each other.
	std::thread writer([&] {
		while (!go.load())
			std::this_thread::yield();
		const levent_t same{const_cast<char *>("top"), 200};
		while (!done.load()) {
			void *db = openlevdb_r();
			if (db != nullptr && putlevent_r(db, &same) == 0)
				writes.fetch_add(1);
			if (db != nullptr)
				closelevdb_r(db);
		}
	});
	std::vector<std::thread> readers;
	for (int t = 0; t < kThreads; ++t) {
		readers.emplace_back([&] {
			while (!go.load())
				std::this_thread::yield();
			for (int r = 0; r < kRounds; ++r)
				if (!(compute(subject_.get(), object_.get()) == expected))
					mismatches.fetch_add(1);
		});
	}
	go = true;
	for (std::thread &t : readers)
		t.join();
	done = true;
	writer.join();
	EXPECT_EQ(mismatches.load(), 0);
	EXPECT_GT(writes.load(), 0);
	EXPECT_EQ(read_file(db_->path("levels")), ScratchDb::kLevels);
	EXPECT_EQ(vyrl_ucnt(subject_.get()), 1);
	EXPECT_EQ(vyrl_ucnt(object_.get()), 1);
	EXPECT_EQ(vyrml_ucnt(object_->ml), 1);
}

// References handed to several threads and dropped there in any order: the
// last drop, wherever it happens, frees the label exactly once (a double or
// missing free shows under the sanitizers and valgrind).
TEST_F(SharedLabels, LastOfConcurrentDropsFreesOnce)
{
	for (int round = 0; round < 50; ++round) {
		vyrl_t *l = vyrl_dup(object_.get());
		ASSERT_NE(l, nullptr);
		for (int t = 1; t < kThreads; ++t)
			vyrl_get(l);
		// Parts shared with a second label outlive the first one's drop.
		vyrml_t *ml = vyrml_get(l->ml);
		std::vector<std::thread> droppers;
		for (int t = 0; t < kThreads; ++t)
			droppers.emplace_back([l] { vyrl_put(l); });
		for (std::thread &t : droppers)
			t.join();
		EXPECT_EQ(vyrml_ucnt(ml), 1);
		EXPECT_EQ(ml->blob_size, 5u);
		vyrml_put(ml);
	}
}

// Kernel calls from several threads at once: reads of a file's and of the
// process's label through the service channel, which every call opens.
TEST_F(SharedLabels, KernelReadsFromThreads)
{
	const std::string file = db_->path("labelled");
	install_file(file, "");
	if (vyr_set_path(file.c_str(), object_.get()) != 0)
		GTEST_SKIP() << "no user.* attributes here: " << std::strerror(errno);
	ASSERT_EQ(vyr_set_pid(0, subject_.get()), 0);
	const std::string file_raw = vyr_test::raw_bytes(object_.get()), own_raw = vyr_test::raw_bytes(subject_.get());

	std::atomic<int> mismatches{0};
	std::vector<std::thread> readers;
	for (int t = 0; t < kThreads; ++t) {
		readers.emplace_back([&] {
			for (int r = 0; r < kRounds; ++r) {
				Label f(vyr_get_path(file.c_str()));
				Label p(vyr_get_pid(0));
				if (!f || !p || vyr_test::raw_bytes(f.get()) != file_raw || vyr_test::raw_bytes(p.get()) != own_raw)
					mismatches.fetch_add(1);
			}
		});
	}
	for (std::thread &t : readers)
		t.join();
	EXPECT_EQ(mismatches.load(), 0);
}

} // namespace
} // namespace hardening
