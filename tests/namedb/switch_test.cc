// Start-up of the name databases, binding of plug-in entries, forwarding,
// and charset conversion of names in both directions. Each test runs in a
// fresh process: a database's start-up state lasts as long as the process.

#include <vyr/namedb.h>

#include "namedb/harness.hh"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <dlfcn.h>
#include <langinfo.h>
#include <string>

using namespace nd_test;

namespace {
// When set, the locale charset that this program reports to libvyr.
const char *g_codeset_override = nullptr;
} // namespace

// libvyr reads the locale charset through nl_langinfo(CODESET); this
// definition lets a test report names that no installed locale has.
extern "C" char *nl_langinfo(nl_item item) noexcept
{
	using Fn = char *(*)(nl_item);
	static const auto real = reinterpret_cast<Fn>(dlsym(RTLD_NEXT, "nl_langinfo"));
	if (item == CODESET && g_codeset_override)
		return const_cast<char *>(g_codeset_override);
	return real(item);
}

namespace {

constexpr int kUnchangedErrno = 4242;
constexpr const char *kSecretUtf8 = "\xd0\xa1\xd0\xb5\xd0\xba\xd1\x80\xd0\xb5\xd1\x82"; // "Секрет"

int count_lines(const std::string &s, const std::string &needle)
{
	int n = 0;
	for (size_t at = s.find(needle); at != std::string::npos; at = s.find(needle, at + 1))
		++n;
	return n;
}

// Every function that goes through the switch, for one database, as
// "call, expect failure with errno E" checks.
void expect_all_fail(int err)
{
	struct Check {
		const char *what;
		bool failed;
	};
	char n[] = "x";
	const levent_t lev{n, 1};
	const catent_t cat{n, 1};
	const macent_t mac{n, 0, 0, 0, 0};
	int dummy = 0;
	auto fails_ptr = [&](void *p) { return p == nullptr && errno == err; };
	auto fails_int = [&](int r) { return r == -1 && errno == err; };
	errno = 0;
	const Check checks[] = {
		{"openlevdb_r", fails_ptr(openlevdb_r())},
		{"closelevdb_r", fails_int(closelevdb_r(&dummy))},
		{"setlevent_r", fails_int(setlevent_r(&dummy))},
		{"endlevent_r", fails_int(endlevent_r(&dummy))},
		{"getlevent_r", fails_ptr(getlevent_r(&dummy))},
		{"getlevnam_r", fails_ptr(getlevnam_r(&dummy, "x"))},
		{"getlevval_r", fails_ptr(getlevval_r(&dummy, 1))},
		{"putlevent_r", fails_int(putlevent_r(&dummy, &lev))},
		{"rmlevnam_r", fails_int(rmlevnam_r(&dummy, "x"))},
		{"rmlevval_r", fails_int(rmlevval_r(&dummy, 1))},
		{"opencatdb_r", fails_ptr(opencatdb_r())},
		{"getcatval_r", fails_ptr(getcatval_r(&dummy, 3))},
		{"putcatent_r", fails_int(putcatent_r(&dummy, &cat))},
		{"rmcatval_r", fails_int(rmcatval_r(&dummy, 3))},
		{"openmacdb_r", fails_ptr(openmacdb_r())},
		{"getmacnam_r", fails_ptr(getmacnam_r(&dummy, "root"))},
		{"getmacuid_r", fails_ptr(getmacuid_r(&dummy, 0))},
		{"putmacent_r", fails_int(putmacent_r(&dummy, &mac))},
		{"rmmacnam_r", fails_int(rmmacnam_r(&dummy, "root"))},
	};
	for (const Check &c : checks)
		EXPECT_TRUE(c.failed) << c.what << " should fail with errno " << err;
}

// ---- start-up ----

TEST(Startup, FailedConfigurationIsRetriedOnEveryCall)
{
	in_fresh_process([] {
		use_utf8_locale();
		configure_all("memtest", "UTF-8");
		g_init_result = -1;
		errno = 0;
		EXPECT_EQ(openlevdb_r(), nullptr);
		EXPECT_EQ(errno, EIO) << "errno as the configuration left it";
		EXPECT_EQ(closelevdb_r(nullptr), -1);
		EXPECT_EQ(g_init_calls, 2);
		EXPECT_FALSE(plugin_loaded("memtest"));

		g_init_result = 0;
		Plugin p("memtest"); // loaded ahead: sanitizer runtimes hide libvyr's own search path from dlopen
		void *db = openlevdb_r();
		ASSERT_NE(db, nullptr);
		EXPECT_EQ(g_init_calls, 3);
		EXPECT_EQ(closelevdb_r(db), 0);
		EXPECT_EQ(g_init_calls, 3) << "a started database does not read the configuration again";

		// The other databases start on their own.
		void *cdb = opencatdb_r();
		ASSERT_NE(cdb, nullptr);
		EXPECT_EQ(g_init_calls, 4);
		closecatdb_r(cdb);
	});
}

class NoPluginName : public testing::TestWithParam<const char *> {};

TEST_P(NoPluginName, EveryForwardedCallFailsWithEnosys)
{
	in_fresh_process([] {
		use_utf8_locale();
		configure_all(GetParam(), "UTF-8");
		const std::string err = capture_stderr([] { expect_all_fail(ENOSYS); });
		EXPECT_EQ(err, "") << "no plug-in is loaded, so nothing is reported";
		EXPECT_EQ(g_init_calls, 3) << "one start-up per database, never repeated";

		// The hooks of the user database fail with their own errno.
		errno = 0;
		EXPECT_EQ(getlchuid(0, nullptr), -1);
		EXPECT_EQ(errno, EOPNOTSUPP);
		errno = 0;
		EXPECT_EQ(setlchnam("root", nullptr), -1);
		EXPECT_EQ(errno, EOPNOTSUPP);

		// The line formats don't need a back-end.
		levent_t e{};
		ASSERT_EQ(parse_lev("a:1", &e), &e);
		std::free(e.name);
	});
}

INSTANTIATE_TEST_SUITE_P(Names, NoPluginName, testing::Values("", "fileses", "FILESES", "FiLeSeS", "filesesX"));

TEST(Startup, MissingPluginFileIsReportedOnEachAttempt)
{
	in_fresh_process([] {
		use_utf8_locale();
		configure("lev_backend", "nosuchbackend");
		configure("lev_charset", "UTF-8");
		const std::string err = capture_stderr([] {
			for (int i = 0; i < 3; ++i)
				EXPECT_EQ(openlevdb_r(), nullptr);
		});
		EXPECT_EQ(count_lines(err, "\n"), 3) << err;
		EXPECT_EQ(count_lines(err, "libtavrel-mac-db-nosuchbackend.so.2"), 3) << err;
		EXPECT_EQ(g_init_calls, 3) << "each failed start-up is tried again from the configuration";
	});
}

TEST(Startup, ShortPrefixOfNoPluginNameStillLoads)
{
	// "filese" is not the reserved prefix: a plug-in of that name is sought.
	in_fresh_process([] {
		use_utf8_locale();
		configure("lev_backend", "filese");
		const std::string err = capture_stderr([] { EXPECT_EQ(openlevdb_r(), nullptr); });
		EXPECT_NE(err.find("libtavrel-mac-db-filese.so.2"), std::string::npos) << err;
	});
}

// ---- binding and forwarding ----

TEST(Slots, MissingEntriesFailAloneWithEnosys)
{
	in_fresh_process([] {
		use_utf8_locale();
		configure_all("partial", "UTF-8");
		configure_default_entry(1);
		Plugin p("partial");
		p.add_lev("low", 1);
		void *lev = openlevdb_r();
		ASSERT_NE(lev, nullptr);
		errno = 0;
		EXPECT_EQ(getlevval_r(lev, 1), nullptr);
		EXPECT_EQ(errno, ENOSYS);
		levent_t *e = getlevnam_r(lev, "low");
		ASSERT_NE(e, nullptr) << "the entries that exist work";
		freelevent_r(e);
		EXPECT_EQ(levexstval(lev, 1), 1) << "ENOSYS is no EILSEQ: the value counts as unknown";
		EXPECT_EQ(closelevdb_r(lev), 0);

		void *cat = opencatdb_r();
		errno = 0;
		EXPECT_EQ(rmcatval_r(cat, 1), -1);
		EXPECT_EQ(errno, ENOSYS);
		closecatdb_r(cat);

		// No default entry stands in for an entry that does not exist.
		void *mac = openmacdb_r();
		errno = 0;
		EXPECT_EQ(getmacuid_r(mac, 0), nullptr);
		EXPECT_EQ(errno, ENOSYS);
		closemacdb_r(mac);

		errno = 0;
		EXPECT_EQ(setlchuid(0, nullptr), -1);
		EXPECT_EQ(errno, EOPNOTSUPP);
		p.clear_log();
		int token = 0;
		EXPECT_EQ(getlchuid(0, &token), 7) << "the hook's own result";
		char arg[64];
		std::snprintf(arg, sizeof arg, "arg=%p", static_cast<void *>(&token));
		EXPECT_EQ(p.log(), std::string("do_getlch #null [root] ") + arg + "\n");
	});
}

TEST(Forwarding, HandlesAndResultsPassUntouched)
{
	in_fresh_process([] {
		use_utf8_locale();
		configure_all("memtest", "UTF-8");
		Plugin p("memtest");
		p.knob("close_result", 5);
		p.knob("set_result", -3);
		EXPECT_EQ(closelevdb_r(nullptr), 5) << "a NULL handle is forwarded like any other";
		EXPECT_EQ(setcatent_r(nullptr), -3);
		EXPECT_EQ(endmacent_r(nullptr), 0);
		EXPECT_EQ(p.log(), "closelevdb_r #null \nsetcatent_r #null \nendmacent_r #null \n");
		EXPECT_TRUE(plugin_loaded("memtest"));

		p.knob("open_errno", EACCES);
		errno = 0;
		EXPECT_EQ(openmacdb_r(), nullptr);
		EXPECT_EQ(errno, EACCES);
	});
}

TEST(Forwarding, DatabasesNamingOneBackendShareItsFile)
{
	in_fresh_process([] {
		use_utf8_locale();
		configure_all("memtest", "UTF-8");
		Plugin p("memtest");
		void *lev = openlevdb_r();
		char n[] = "shared";
		const levent_t e{n, 9};
		EXPECT_EQ(putlevent_r(lev, &e), 0);
		EXPECT_EQ(p.rows(Table::lev), 1u) << "the test's handle and libvyr's reach one plug-in instance";
		closelevdb_r(lev);
	});
}

TEST(Forwarding, NullNamesNeverReachThePlugin)
{
	in_fresh_process([] {
		use_utf8_locale();
		configure_all("memtest", "UTF-8");
		Plugin p("memtest");
		void *db = openlevdb_r();
		p.clear_log();
		errno = kUnchangedErrno;
		EXPECT_EQ(getlevnam_r(db, nullptr), nullptr);
		EXPECT_EQ(rmlevnam_r(db, nullptr), -1);
		EXPECT_EQ(getcatnam_r(db, nullptr), nullptr);
		EXPECT_EQ(rmmacnam_r(db, nullptr), -1);
		EXPECT_EQ(getmacnam_r(db, nullptr), nullptr);
		EXPECT_EQ(errno, kUnchangedErrno);
		EXPECT_EQ(p.log(), "");
		closelevdb_r(db);
	});
}

// ---- charset conversion ----

TEST(Charset, NamesAreConvertedBothWays)
{
	in_fresh_process([] {
		use_utf8_locale();
		configure_all("memtest", "UTF-8");
		configure("lev_charset", "KOI8-R");
		const std::string koi = to_koi8r(kSecretUtf8);
		Plugin p("memtest");
		p.add_lev(koi.c_str(), 3);
		void *db = openlevdb_r();
		ASSERT_NE(db, nullptr);

		// Towards the caller: lookups by value, by name and the walk.
		levent_t *e = getlevval_r(db, 3);
		ASSERT_NE(e, nullptr);
		EXPECT_STREQ(e->name, kSecretUtf8);
		freelevent_r(e);
		setlevent_r(db);
		e = getlevent_r(db);
		ASSERT_NE(e, nullptr);
		EXPECT_STREQ(e->name, kSecretUtf8);
		freelevent_r(e);

		// Towards the back-end: the plug-in receives KOI8-R bytes.
		p.clear_log();
		e = getlevnam_r(db, kSecretUtf8);
		ASSERT_NE(e, nullptr);
		EXPECT_STREQ(e->name, kSecretUtf8);
		EXPECT_EQ(e->value, 3);
		freelevent_r(e);
		EXPECT_EQ(p.log(), "getlevnam_r #1 [" + koi + "]\n");

		// Records: the plug-in gets a converted copy, the caller's record
		// stays as it was.
		char name[32];
		std::strcpy(name, kSecretUtf8);
		const levent_t mine{name, 7};
		p.clear_log();
		EXPECT_EQ(putlevent_r(db, &mine), 0);
		EXPECT_EQ(rmlevnam_r(db, kSecretUtf8), 0);
		EXPECT_EQ(p.log(), "putlevent_r #1 [" + koi + "]\nrmlevnam_r #1 [" + koi + "]\n");
		EXPECT_EQ(mine.name, name);
		EXPECT_STREQ(name, kSecretUtf8);
		EXPECT_EQ(mine.value, 7);
		closelevdb_r(db);

		// The other databases keep their own (equal) charset: no conversion.
		void *cat = opencatdb_r();
		p.clear_log();
		catent_t *c = getcatnam_r(cat, kSecretUtf8);
		EXPECT_EQ(c, nullptr);
		EXPECT_EQ(p.log(), std::string("getcatnam_r #2 [") + kSecretUtf8 + "]\n");
		closecatdb_r(cat);
	});
}

TEST(Charset, CharsetsDifferingInCaseNeedNoConversion)
{
	in_fresh_process([] {
		use_utf8_locale();
		configure_all("memtest", "utf-8");
		Plugin p("memtest");
		p.knob("log_ptrs", 1);
		void *db = openlevdb_r();
		char name[] = "plain";
		const levent_t mine{name, 1};
		p.clear_log();
		EXPECT_EQ(putlevent_r(db, &mine), 0);
		freelevent_r(getlevnam_r(db, name));
		char want[160];
		std::snprintf(want, sizeof want, "putlevent_r #1 [plain]@%p rec@%p\ngetlevnam_r #1 [plain]@%p\n",
			      static_cast<void *>(name), static_cast<const void *>(&mine), static_cast<void *>(name));
		EXPECT_EQ(p.log(), want) << "the caller's own pointers reach the plug-in";
		closelevdb_r(db);
	});
}

TEST(Charset, UnknownCharsetGivesPlainCopiesAndUnconvertedResults)
{
	in_fresh_process([] {
		use_utf8_locale();
		configure_all("memtest", "NO-SUCH-CHARSET-42");
		const std::string koi = to_koi8r(kSecretUtf8);
		Plugin p("memtest");
		p.add_cat(koi.c_str(), 4);
		p.knob("log_ptrs", 1);
		void *db = opencatdb_r();
		char name[] = "plain";
		p.clear_log();
		EXPECT_EQ(getcatnam_r(db, name), nullptr);
		const std::string log = p.log();
		EXPECT_EQ(log.rfind("getcatnam_r #1 [plain]@", 0), 0u) << log;
		char mine[32];
		std::snprintf(mine, sizeof mine, "@%p", static_cast<void *>(name));
		EXPECT_EQ(log.find(mine), std::string::npos) << "a copy, not the caller's string, goes out";

		catent_t *c = getcatval_r(db, 4);
		ASSERT_NE(c, nullptr) << "a refused conversion is no failure";
		EXPECT_EQ(std::string(c->name), koi);
		freecatent_r(c);
		closecatdb_r(db);
	});
}

TEST(Charset, UnconvertibleTextFallsBackBothWays)
{
	in_fresh_process([] {
		use_utf8_locale();
		configure_all("memtest", "UTF-8");
		configure("lev_charset", "KOI8-R");
		configure("cat_charset", "ASCII");
		Plugin p("memtest");
		p.add_cat("caf\xe9", 1); // not ASCII: can't come back converted
		void *lev = openlevdb_r();
		void *cat = opencatdb_r();

		// No KOI8-R form: the name goes out as a plain copy.
		const char *kanji = "\xe6\x97\xa5\xe6\x9c\xac";
		p.clear_log();
		EXPECT_EQ(getlevnam_r(lev, kanji), nullptr);
		EXPECT_EQ(p.log(), std::string("getlevnam_r #1 [") + kanji + "]\n");

		// No UTF-8 form from ASCII: the lookup still succeeds, bytes as stored.
		catent_t *c = getcatval_r(cat, 1);
		ASSERT_NE(c, nullptr);
		EXPECT_STREQ(c->name, "caf\xe9");
		freecatent_r(c);
		closelevdb_r(lev);
		closecatdb_r(cat);
	});
}

TEST(Charset, LongLocaleCharsetNamesAreCutTo31Characters)
{
	// 40 characters; only the first 31 are kept at start-up.
	static const char kLong[] = "X-VERY-LONG-CHARSET-NAME-ABCDEFGHIJKLMNO";
	const std::string cut(kLong, 31);
	struct Case {
		std::string backend_charset;
		bool converts;
	} cases[] = {{cut, false}, {kLong, true}};
	for (const Case &c : cases) {
		in_fresh_process([&] {
			g_codeset_override = kLong;
			configure_all("memtest", "UTF-8");
			configure("lev_charset", c.backend_charset);
			Plugin p("memtest");
			p.knob("log_ptrs", 1);
			void *db = openlevdb_r();
			char name[] = "n";
			p.clear_log();
			EXPECT_EQ(getlevnam_r(db, name), nullptr);
			char mine[40];
			std::snprintf(mine, sizeof mine, "[n]@%p\n", static_cast<void *>(name));
			// Converting means a copy (plain, as iconv knows neither name).
			EXPECT_EQ(p.log().find(mine) == std::string::npos, c.converts) << c.backend_charset << ": " << p.log();
			closelevdb_r(db);
		});
	}
}

} // namespace
