// The level, category and user label databases through the in-memory test
// plug-in: value handling, the existence tests, record admission, default
// user entries, the lch hooks, and allocation failure in the charset copies
// and the default entries. Each test runs in a fresh process.

#include <vyr/namedb.h>

#include "namedb/harness.hh"
#include "support/failalloc.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <pwd.h>
#include <string>

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
	char *name = reinterpret_cast<char *>(pw + 1);
	std::memcpy(name, kName, sizeof kName);
	pw->pw_name = name;
	return pw;
}

namespace {

constexpr const char *kSecretUtf8 = "\xd0\xa1\xd0\xb5\xd0\xba\xd1\x80\xd0\xb5\xd1\x82";
constexpr uint32_t kNoSuchUid = 3999999;

// A fresh process with every database on the memtest plug-in.
void with_memtest(const std::function<void(const Plugin &)> &body, const char *charset = "UTF-8")
{
	in_fresh_process([&] {
		use_utf8_locale();
		configure_all("memtest", "UTF-8");
		configure("mac_charset", charset);
		configure("lev_charset", charset);
		Plugin p("memtest");
		body(p);
	});
}

// ---- level database ----

TEST(Levels, ValuesAreCutToEightBits)
{
	with_memtest([](const Plugin &p) {
		p.add_lev("one", 1);
		void *db = openlevdb_r();
		p.clear_log();
		levent_t *e = getlevval_r(db, 0x101);
		ASSERT_NE(e, nullptr);
		EXPECT_STREQ(e->name, "one");
		freelevent_r(e);
		EXPECT_EQ(rmlevval_r(db, 0x101), 0);
		EXPECT_EQ(rmlevval_r(db, -1), -1); // 255: not there
		EXPECT_EQ(p.log(), "getlevval_r #1 1\nrmlevval_r #1 1\nrmlevval_r #1 255\n");
		closelevdb_r(db);
	});
}

TEST(Levels, PutForwardsAnyRecord)
{
	with_memtest([](const Plugin &p) {
		p.knob("put_result", 5);
		void *db = openlevdb_r();
		const levent_t nameless{nullptr, 1};
		p.clear_log();
		EXPECT_EQ(putlevent_r(db, nullptr), 5);
		EXPECT_EQ(putlevent_r(db, &nameless), 5);
		EXPECT_EQ(p.log(), "putlevent_r #1 <null-record>\nputlevent_r #1 <null-name>\n");
		closelevdb_r(db);
	});
}

TEST(Levels, ExistenceTest)
{
	with_memtest([](const Plugin &p) {
		p.add_lev("two", 2);
		p.knob("lev_eilseq", 9);
		void *db = openlevdb_r();
		p.clear_log();
		EXPECT_EQ(levexstval(db, 2), 0);
		EXPECT_EQ(levexstval(db, 0x102), 0);
		EXPECT_EQ(levexstval(db, 9), 0) << "EILSEQ says the value exists";
		EXPECT_EQ(levexstval(db, 3), 1);
		EXPECT_EQ(p.log(), "getlevval_r #1 2\ngetlevval_r #1 2\ngetlevval_r #1 9\ngetlevval_r #1 3\n")
			<< "with a handle nothing is opened or closed";
		closelevdb_r(db);

		p.clear_log();
		EXPECT_EQ(levexstval(nullptr, 2), 0);
		EXPECT_EQ(p.log(), "openlevdb_r #2 \ngetlevval_r #2 2\ncloselevdb_r #2 \n");
		EXPECT_EQ(p.live_handles(), 0);

		p.knob("close_result", 1);
		EXPECT_EQ(levexstval(nullptr, 2), -1) << "a failed close overrides the answer";
		p.knob("close_result", 0);
		p.knob("open_errno", EACCES);
		EXPECT_EQ(levexstval(nullptr, 2), -1);
	});
}

TEST(Levels, ExistenceWithoutPluginFails)
{
	in_fresh_process([] {
		configure_all("", "UTF-8");
		errno = 0;
		EXPECT_EQ(levexstval(nullptr, 1), -1);
		EXPECT_EQ(errno, ENOSYS);
	});
}

// ---- category database ----

struct Admission {
	bool null_record;
	uint64_t value;
	bool admitted;
};

const Admission kAdmission[] = {
	{true, 0, false},
	{false, 0, false},
	{false, 3, false},
	{false, 0x8000000000000001ull, false},
	{false, 0xc000000000000000ull, false},
	{false, 1, true},
	{false, 0x10, true},
	{false, 0x8000000000000000ull, true},
};

TEST(Categories, PutAdmitsOnlySingleBits)
{
	with_memtest([](const Plugin &p) {
		p.knob("put_result", 5);
		void *db = opencatdb_r();
		char n[] = "c";
		for (const Admission &a : kAdmission) {
			const catent_t e{n, a.value};
			errno = 0;
			const int r = putcatent_r(db, a.null_record ? nullptr : &e);
			if (a.admitted) {
				EXPECT_EQ(r, 5) << std::hex << a.value;
			} else {
				EXPECT_EQ(r, -1) << std::hex << a.value;
				EXPECT_EQ(errno, EINVAL) << std::hex << a.value;
			}
		}
		closecatdb_r(db);
	});
}

TEST(Categories, BadRecordsFailBeforeStartup)
{
	in_fresh_process([] {
		configure_all("", "UTF-8");
		char n[] = "c";
		const catent_t two_bits{n, 6};
		errno = 0;
		EXPECT_EQ(putcatent_r(nullptr, &two_bits), -1);
		EXPECT_EQ(errno, EINVAL);
		EXPECT_EQ(g_init_calls, 0) << "admission comes before the start-up";
		const catent_t one_bit{n, 4};
		errno = 0;
		EXPECT_EQ(putcatent_r(nullptr, &one_bit), -1);
		EXPECT_EQ(errno, ENOSYS);
		EXPECT_EQ(g_init_calls, 1);

		EXPECT_EQ(is_cats_valid(nullptr, 0), 0) << "an empty mask needs no database";
		errno = 0;
		EXPECT_EQ(is_cats_valid(nullptr, 1), -1);
		EXPECT_EQ(errno, ENOSYS);
	});
}

TEST(Categories, ValuesPassWhole)
{
	with_memtest([](const Plugin &p) {
		void *db = opencatdb_r();
		p.clear_log();
		EXPECT_EQ(getcatval_r(db, 0), nullptr);
		EXPECT_EQ(getcatval_r(db, 0xf0f0000000000001ull), nullptr);
		EXPECT_EQ(rmcatval_r(db, 0x300), -1);
		EXPECT_EQ(p.log(), "getcatval_r #1 0\ngetcatval_r #1 17361376563513262081\nrmcatval_r #1 768\n");
		closecatdb_r(db);
	});
}

TEST(Categories, MaskTestWalksBitsUpwardAndStopsAtUnknown)
{
	with_memtest([](const Plugin &p) {
		p.add_cat("a", 1);
		p.add_cat("b", 4);
		p.add_cat("top", 0x8000000000000000ull);
		p.knob("cat_eilseq", 2);
		void *db = opencatdb_r();
		p.clear_log();
		EXPECT_EQ(is_cats_valid(db, 0x8000000000000007ull), 0);
		EXPECT_EQ(p.log(), "getcatval_r #1 1\ngetcatval_r #1 2\ngetcatval_r #1 4\n"
				   "getcatval_r #1 9223372036854775808\n");
		p.clear_log();
		EXPECT_EQ(is_cats_valid(db, 0x8000000000000019ull), 1);
		EXPECT_EQ(p.log(), "getcatval_r #1 1\ngetcatval_r #1 8\n") << "bits above the unknown one are not tried";
		EXPECT_EQ(is_cats_valid(db, 0), 0);
		closecatdb_r(db);

		p.clear_log();
		EXPECT_EQ(is_cats_valid(nullptr, 5), 0);
		EXPECT_EQ(p.log(), "opencatdb_r #2 \ngetcatval_r #2 1\ngetcatval_r #2 4\nclosecatdb_r #2 \n");
		p.knob("close_result", -2);
		EXPECT_EQ(is_cats_valid(nullptr, 8), -1);
		EXPECT_EQ(p.live_handles(), 0);
	});
}

// ---- user label database ----

struct DefaultCase {
	uint32_t default_on;
	int miss_errno;
	bool default_made;
};

const DefaultCase kDefaultCases[] = {
	{1, ENOENT, true}, {1, ENODATA, true}, {1, EIO, false},
	{0, ENOENT, false}, {0, ENODATA, false},
};

class DefaultByName : public testing::TestWithParam<DefaultCase> {};

TEST_P(DefaultByName, MissingUser)
{
	const DefaultCase c = GetParam();
	with_memtest([&](const Plugin &p) {
		configure_default_entry(c.default_on);
		p.knob("miss_errno", c.miss_errno);
		void *db = openmacdb_r();
		errno = 0;
		macent_t *e = getmacnam_r(db, "nobody-at-all");
		EXPECT_EQ(errno, c.miss_errno) << "the back-end's errno stays";
		if (!c.default_made) {
			EXPECT_EQ(e, nullptr);
		} else {
			ASSERT_NE(e, nullptr);
			EXPECT_STREQ(e->name, "nobody-at-all");
			EXPECT_EQ(e->lev1, 0);
			EXPECT_EQ(e->cat1, 0u);
			EXPECT_EQ(e->lev2, 0);
			EXPECT_EQ(e->cat2, 0u);
			freemacent_r(e);
		}
		closemacdb_r(db);
	});
}

INSTANTIATE_TEST_SUITE_P(Table, DefaultByName, testing::ValuesIn(kDefaultCases));

class DefaultByUid : public testing::TestWithParam<DefaultCase> {};

TEST_P(DefaultByUid, MissingUser)
{
	const DefaultCase c = GetParam();
	with_memtest([&](const Plugin &p) {
		configure_default_entry(c.default_on);
		p.knob("miss_errno", c.miss_errno);
		void *db = openmacdb_r();
		errno = 0;
		macent_t *e = getmacuid_r(db, 0); // root: known to the system
		if (!c.default_made) {
			EXPECT_EQ(e, nullptr);
			EXPECT_EQ(errno, c.miss_errno);
		} else {
			ASSERT_NE(e, nullptr);
			EXPECT_EQ(errno, 0);
			EXPECT_STREQ(e->name, "root");
			EXPECT_EQ(e->lev1 | e->lev2, 0);
			EXPECT_EQ(e->cat1 | e->cat2, 0u);
			freemacent_r(e);
		}
		// A uid that the system does not know gets no default entry.
		EXPECT_EQ(getmacuid_r(db, kNoSuchUid), nullptr);
		closemacdb_r(db);
	});
}

INSTANTIATE_TEST_SUITE_P(Table, DefaultByUid, testing::ValuesIn(kDefaultCases));

TEST(Users, KnownUsersComeBackConverted)
{
	with_memtest(
		[](const Plugin &p) {
			configure_default_entry(1);
			const std::string koi = to_koi8r(kSecretUtf8);
			p.add_mac(koi.c_str(), 1, 2, 3, 4, 1000);
			void *db = openmacdb_r();
			macent_t *e = getmacuid_r(db, 1000);
			ASSERT_NE(e, nullptr);
			EXPECT_STREQ(e->name, kSecretUtf8);
			EXPECT_EQ(e->lev1, 1);
			EXPECT_EQ(e->cat1, 2u);
			EXPECT_EQ(e->lev2, 3);
			EXPECT_EQ(e->cat2, 4u);
			freemacent_r(e);
			e = getmacnam_r(db, kSecretUtf8);
			ASSERT_NE(e, nullptr);
			EXPECT_EQ(e->cat2, 4u);
			freemacent_r(e);
			closemacdb_r(db);
		},
		"KOI8-R");
}

TEST(Users, DefaultEntryKeepsTheCallersText)
{
	with_memtest(
		[](const Plugin &p) {
			configure_default_entry(1);
			void *db = openmacdb_r();
			p.clear_log();
			macent_t *e = getmacnam_r(db, kSecretUtf8);
			ASSERT_NE(e, nullptr);
			EXPECT_STREQ(e->name, kSecretUtf8) << "not the KOI8-R copy made for the back-end";
			EXPECT_EQ(p.log(), "getmacnam_r #1 [" + to_koi8r(kSecretUtf8) + "]\n");
			freemacent_r(e);
			closemacdb_r(db);
		},
		"KOI8-R");
}

TEST(Users, LchHooksGetTheUserRecord)
{
	with_memtest([](const Plugin &p) {
		p.knob("lch_result", 11);
		int token = 0;
		char arg[40];
		std::snprintf(arg, sizeof arg, " arg=%p\n", static_cast<void *>(&token));
		p.clear_log();
		EXPECT_EQ(getlchnam("root", &token), 11);
		EXPECT_EQ(setlchuid(0, &token), 11);
		EXPECT_EQ(p.log(), std::string("do_getlch #null [root]") + arg + "do_setlch #null [root]" + arg);

		p.clear_log();
		errno = 0;
		EXPECT_EQ(setlchnam("no-such-user-here", &token), -1);
		EXPECT_EQ(errno, ENOENT) << "as the user lookup left it";
		EXPECT_EQ(getlchuid(kNoSuchUid, &token), -1);
		EXPECT_EQ(p.log(), "") << "no hook runs without a user";
	});
}

// ---- allocation failure ----

// Runs `attempt` through the sweep after one warm-up call, which loads the
// charset modules that stay cached for the life of the process.
template <class F>
void sweep_after_warmup(F &&attempt)
{
	vyr_test::Injector warm(0);
	attempt(warm);
	vyr_test::sweep_alloc_failures(attempt);
}

TEST(AllocFailure, ConvertedLookupByName)
{
	with_memtest(
		[](const Plugin &p) {
			p.add_lev(to_koi8r(kSecretUtf8).c_str(), 3);
			p.knob("quiet", 1);
			void *db = openlevdb_r();
			sweep_after_warmup([&](vyr_test::Injector &inj) {
				levent_t *e = inj.run([&] { return getlevnam_r(db, kSecretUtf8); });
				if (!e) {
					EXPECT_TRUE(inj.fired());
					return;
				}
				// Without memory for the conversion back, the stored bytes
				// stand in.
				if (!inj.fired()) {
					EXPECT_STREQ(e->name, kSecretUtf8);
				}
				EXPECT_EQ(e->value, 3);
				freelevent_r(e);
			});
			closelevdb_r(db);
		},
		"KOI8-R");
}

TEST(AllocFailure, ConvertedRecordCopy)
{
	with_memtest(
		[](const Plugin &p) {
			p.knob("quiet", 1);
			p.knob("no_store", 1);
			p.knob("put_result", 3);
			void *db = openlevdb_r();
			char name[32];
			std::strcpy(name, kSecretUtf8);
			const levent_t mine{name, 5};
			sweep_after_warmup([&](vyr_test::Injector &inj) {
				const int r = inj.run([&] { return putlevent_r(db, &mine); });
				EXPECT_EQ(r, 3) << "the entry is called whatever the copies gave";
				EXPECT_EQ(mine.name, name);
				EXPECT_STREQ(name, kSecretUtf8);
			});
			closelevdb_r(db);
		},
		"KOI8-R");
}

TEST(AllocFailure, DefaultEntryByName)
{
	with_memtest([](const Plugin &p) {
		configure_default_entry(1);
		p.knob("quiet", 1);
		void *db = openmacdb_r();
		sweep_after_warmup([&](vyr_test::Injector &inj) {
			errno = 0;
			macent_t *e = inj.run([&] { return getmacnam_r(db, "ghost"); });
			if (!e) {
				EXPECT_TRUE(inj.fired());
				return;
			}
			EXPECT_EQ(errno, ENOENT);
			if (e->name) {
				EXPECT_STREQ(e->name, "ghost");
			} else {
				EXPECT_TRUE(inj.fired()) << "only a failed copy leaves the name NULL";
			}
			EXPECT_EQ(e->lev1 | e->lev2, 0);
			freemacent_r(e);
		});
		closemacdb_r(db);
	});
}

TEST(AllocFailure, DefaultEntryByUid)
{
	with_memtest([](const Plugin &p) {
		configure_default_entry(1);
		p.knob("quiet", 1);
		void *db = openmacdb_r();
		sweep_after_warmup([&](vyr_test::Injector &inj) {
			errno = EIO;
			macent_t *e = inj.run([&] { return getmacuid_r(db, 0); });
			if (!e) {
				EXPECT_TRUE(inj.fired());
				return;
			}
			EXPECT_EQ(errno, 0);
			if (e->name) {
				EXPECT_STREQ(e->name, "root");
			} else {
				EXPECT_TRUE(inj.fired()) << "only a failed copy leaves the name NULL";
			}
			freemacent_r(e);
		});
		closemacdb_r(db);
	});
}

} // namespace
