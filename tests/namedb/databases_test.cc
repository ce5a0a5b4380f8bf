// The level, category and user label databases: value handling, the
// existence tests, record admission, default user entries, the lch hooks,
// and allocation failure in the charset copies and the default entries.

#include <vyr/namedb.h>

#include "namedb/harness.hh"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ostream>
#include <pwd.h>
#include <string>
#include <vector>

using namespace nd_test;

// The system's user database keeps caches of its own whose allocations the
// failing allocator would count, so the lookup by uid is replaced in this
// program by one that knows a single user, root, and allocates one block.
extern "C" struct passwd *zenk_getpwuid(uint32_t uid) noexcept
{
	if (uid != 0) {
		errno = ENOENT;
		return nullptr;
	}
	static const char kName[] = "root";
	auto *pw = static_cast<struct passwd *>(std::calloc(1, sizeof(struct passwd) + sizeof kName));
	if (!pw)
		return nullptr;
	pw->pw_name = static_cast<char *>(std::memcpy(pw + 1, kName, sizeof kName));
	return pw;
}

namespace {

constexpr uint32_t kNoSuchUid = 3999999;

// ---- level database ----

TEST(Levels, ExistenceTest)
{
	with_memtest([] {
		memtest_ctl_add_lev("two", 2);
		knob(memtest::kEilseqValue, 9);
		void *db = openlevdb_r();
		memtest_ctl_clear_log();
		EXPECT_EQ(levexstval(db, 0x102), 0);
		EXPECT_EQ(levexstval(db, 9), 0) << "EILSEQ says the value exists";
		EXPECT_EQ(levexstval(db, 3), 1);
		EXPECT_EQ(log(), "getlevval_r #1 2\ngetlevval_r #1 9\ngetlevval_r #1 3\n")
			<< "with a handle nothing is opened or closed";
		closelevdb_r(db);

		memtest_ctl_clear_log();
		EXPECT_EQ(levexstval(nullptr, 2), 0);
		EXPECT_EQ(log(), "openlevdb_r #2 \ngetlevval_r #2 2\ncloselevdb_r #2 \n");
		knob(memtest::kCloseResult, 1);
		EXPECT_EQ(levexstval(nullptr, 2), -1) << "a failed close overrides the answer";
		knob(memtest::kCloseResult, 0);
		knob(memtest::kOpenErrno, EACCES);
		EXPECT_EQ(levexstval(nullptr, 2), -1);
		EXPECT_EQ(memtest_ctl_live_handles(), 0);
	});
}

// ---- category database ----

TEST(Categories, PutAdmitsOnlySingleBits)
{
	// value, admitted; kNull (not one bit either) stands for a NULL record
	constexpr uint64_t kNull = ~0ull;
	const std::pair<uint64_t, bool> cases[] = {
		{kNull, false}, {0, false}, {3, false}, {0x8000000000000001ull, false}, {0xc000000000000000ull, false},
		{1, true},      {0x10, true}, {0x8000000000000000ull, true},
	};
	with_memtest([&] {
		knob(memtest::kPutResult, 5);
		char n[] = "c";
		for (const auto &[value, admitted] : cases) {
			const catent_t e{n, value};
			errno = 0;
			EXPECT_EQ(putcatent_r(nullptr, value == kNull ? nullptr : &e), admitted ? 5 : -1) << std::hex << value;
			EXPECT_EQ(errno, admitted ? 0 : EINVAL) << std::hex << value;
		}
	});
}

TEST(Categories, ValuesPassWhole)
{
	with_memtest([] {
		EXPECT_EQ(getcatval_r(nullptr, 0), nullptr);
		EXPECT_EQ(getcatval_r(nullptr, 0xf0f0000000000001ull), nullptr);
		EXPECT_EQ(rmcatval_r(nullptr, 0x300), -1);
		EXPECT_EQ(log(), "getcatval_r #null 0\ngetcatval_r #null 17361376563513262081\nrmcatval_r #null 768\n");
	});
}

TEST(Categories, MaskTestWalksBitsUpwardAndStopsAtUnknown)
{
	with_memtest([] {
		memtest_ctl_add_cat("a", 1);
		memtest_ctl_add_cat("b", 4);
		memtest_ctl_add_cat("top", 0x8000000000000000ull);
		knob(memtest::kEilseqValue, 2);
		void *db = opencatdb_r();
		memtest_ctl_clear_log();
		EXPECT_EQ(is_cats_valid(db, 0x8000000000000007ull), 0);
		EXPECT_EQ(log(), "getcatval_r #1 1\ngetcatval_r #1 2\ngetcatval_r #1 4\n"
				 "getcatval_r #1 9223372036854775808\n");
		memtest_ctl_clear_log();
		EXPECT_EQ(is_cats_valid(db, 0x8000000000000019ull), 1);
		EXPECT_EQ(log(), "getcatval_r #1 1\ngetcatval_r #1 8\n") << "bits above the unknown one are not tried";
		closecatdb_r(db);

		memtest_ctl_clear_log();
		EXPECT_EQ(is_cats_valid(nullptr, 5), 0);
		EXPECT_EQ(log(), "opencatdb_r #2 \ngetcatval_r #2 1\ngetcatval_r #2 4\nclosecatdb_r #2 \n");
		knob(memtest::kCloseResult, -2);
		EXPECT_EQ(is_cats_valid(nullptr, 8), -1);
		EXPECT_EQ(memtest_ctl_live_handles(), 0);
	});
}

// Without a plug-in: the admission of category records comes before the
// start-up, an empty mask needs no database, and the existence tests can't
// open one.
TEST(NoPlugin, ChecksBeforeStartupAndFailedOpens)
{
	in_fresh_process([] {
		configure_all("", "UTF-8");
		char n[] = "c";
		const catent_t two_bits{n, 6}, one_bit{n, 4};
		EXPECT_TRUE(failed_with(putcatent_r(nullptr, &two_bits) == -1, EINVAL));
		EXPECT_EQ(is_cats_valid(nullptr, 0), 0);
		EXPECT_EQ(g_init_calls, 0);
		EXPECT_TRUE(failed_with(putcatent_r(nullptr, &one_bit) == -1, ENOSYS));
		EXPECT_TRUE(failed_with(is_cats_valid(nullptr, 1) == -1, ENOSYS));
		EXPECT_TRUE(failed_with(levexstval(nullptr, 1) == -1, ENOSYS));
	});
}

// ---- user label database ----

struct DefaultCase {
	uint32_t default_on = 0;
	int miss_errno = 0;
	bool made = false;
};

// gtest would otherwise print the raw bytes of a case, padding included, in
// every listing of the tests.
void PrintTo(const DefaultCase &c, std::ostream *os)
{
	*os << "{default_on " << c.default_on << ", miss " << strerrorname_np(c.miss_errno) << ", "
	    << (c.made ? "made" : "not made") << "}";
}

class DefaultEntry : public testing::TestWithParam<DefaultCase> {};

TEST_P(DefaultEntry, ForUsersThePluginLacks)
{
	const DefaultCase c = GetParam();
	with_memtest([&] {
		dbroute_cfg.mac_default_entry = c.default_on;
		knob(memtest::kMissErrno, c.miss_errno);
		errno = 0;
		// No user of that name on the system either: a default entry all the same.
		EXPECT_EQ(take(getmacnam_r(nullptr, "nobody-at-all")), c.made ? "nobody-at-all:0:0:0:0" : "null");
		EXPECT_EQ(errno, c.miss_errno) << "the back-end's errno stays";
		EXPECT_EQ(take(getmacuid_r(nullptr, 0)), c.made ? "root:0:0:0:0" : "null"); // root: known to the system
		EXPECT_EQ(errno, c.made ? 0 : c.miss_errno);
		EXPECT_EQ(getmacuid_r(nullptr, kNoSuchUid), nullptr) << "the system must know the uid";
	});
}

INSTANTIATE_TEST_SUITE_P(Table, DefaultEntry,
			 testing::Values(DefaultCase{1, ENOENT, true}, DefaultCase{1, ENODATA, true},
					 DefaultCase{1, EIO, false}, DefaultCase{0, ENOENT, false}));

TEST(Users, DefaultEntryKeepsTheCallersText)
{
	with_memtest(
		[] {
			dbroute_cfg.mac_default_entry = 1;
			// Not the KOI8-R copy made for the back-end.
			EXPECT_EQ(take(getmacnam_r(nullptr, kSecretUtf8)), kSecretUtf8 + std::string(":0:0:0:0"));
			EXPECT_EQ(log(), std::string("getmacnam_r #null [") + kSecretKoi8 + "]\n");
		},
		"KOI8-R");
}

TEST(Users, LchHooksGetTheUserRecord)
{
	with_memtest([] {
		knob(memtest::kLchResult, 11);
		int token = 0;
		char arg[40];
		std::snprintf(arg, sizeof arg, " arg=%p\n", static_cast<void *>(&token));
		EXPECT_EQ(getlchnam("root", &token), 11);
		EXPECT_EQ(setlchuid(0, &token), 11);
		EXPECT_EQ(log(), std::string("do_getlch #null [root]") + arg + "do_setlch #null [root]" + arg);

		memtest_ctl_clear_log();
		EXPECT_TRUE(failed_with(setlchnam("no-such-user-here", &token) == -1, ENOENT)) << "as the lookup left it";
		EXPECT_EQ(getlchuid(kNoSuchUid, &token), -1);
		EXPECT_EQ(log(), "") << "no hook runs without a user";
	});
}

// ---- allocation failure ----

TEST(AllocFailure, ConvertedLookupByName)
{
	with_memtest(
		[] {
			memtest_ctl_add_lev(kSecretKoi8, 3);
			// With the way there failing the lookup gives nothing; with the way
			// back failing, the stored bytes stand in. How many allocations
			// each way takes is the charset converter's business.
			const std::string got = sweep_results([] { return getlevnam_r(nullptr, kSecretUtf8); });
			// Expected: "null | ... | <stored>:3 | ... | <converted>:3", each
			// run at least once.
			std::vector<std::string> runs;
			for (size_t at = 0, bar; at <= got.size(); at = bar + 3) {
				bar = got.find(" | ", at);
				if (bar == std::string::npos)
					bar = got.size();
				runs.push_back(got.substr(at, bar - at));
			}
			const std::string stored = std::string(kSecretKoi8) + ":3";
			size_t i = 0;
			while (i < runs.size() && runs[i] == "null")
				++i;
			const size_t nulls = i;
			while (i < runs.size() && runs[i] == stored)
				++i;
			EXPECT_TRUE(nulls > 0 && i > nulls && i + 1 == runs.size() &&
			            runs.back() == std::string(kSecretUtf8) + ":3")
				<< got;
		},
		"KOI8-R");
}

// A default entry is the entry, then a copy of the name (the uid lookup
// fetches the user first); a failed copy still gives the entry, nameless.
TEST(AllocFailure, DefaultEntries)
{
	with_memtest([] {
		dbroute_cfg.mac_default_entry = 1;
		const std::string nameless = strdup_can_fail() ? "<null-name>:0:0:0:0 | " : "";
		EXPECT_EQ(sweep_results([] { return getmacnam_r(nullptr, "ghost"); }), "null | " + nameless + "ghost:0:0:0:0");
		EXPECT_EQ(sweep_results([] { return getmacuid_r(nullptr, 0); }),
			  "null | null | " + nameless + "root:0:0:0:0");
	});
}

TEST(AllocFailure, LchHooksReleaseTheUserRecord)
{
	with_memtest([] {
		vyr_test::sweep_alloc_failures([](vyr_test::Injector &inj) {
			const int r = inj.run([] { return setlchuid(0, nullptr); });
			EXPECT_EQ(r, inj.fired() ? -1 : 7);
		});
	});
}

TEST(AllocFailure, ConvertedRecordCopy)
{
	with_memtest(
		[] {
			knob(memtest::kPutResult, 3);
			char name[32];
			std::strcpy(name, kSecretUtf8);
			const levent_t mine{name, 5};
			auto attempt = [&](vyr_test::Injector &inj) {
				EXPECT_EQ(inj.run([&] { return putlevent_r(nullptr, &mine); }), 3)
					<< "the entry is called whatever the copies gave";
				EXPECT_EQ(mine.name, name);
				EXPECT_STREQ(name, kSecretUtf8);
			};
			vyr_test::Injector warm(0);
			attempt(warm);
			vyr_test::sweep_alloc_failures(attempt);
		},
		"KOI8-R");
}

} // namespace
