// Start-up of the name databases, binding of plug-in entries, forwarding,
// and charset conversion of names in both directions.

#include <vyr/namedb.h>

#include "namedb/harness.hh"

#include <gtest/gtest.h>

#include <cerrno>
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

// ---- start-up ----

TEST(Startup, FailedConfigurationIsRetriedOnEveryCall)
{
	in_fresh_process([] {
		configure_all("memtest", "UTF-8");
		g_init_result = -1;
		EXPECT_TRUE(failed_with(openlevdb_r() == nullptr, EIO)) << "errno as the configuration left it";
		EXPECT_EQ(closelevdb_r(nullptr), -1);
		EXPECT_EQ(g_init_calls, 2);
		g_init_result = 0;
		EXPECT_EQ(closelevdb_r(openlevdb_r()), 0);
		EXPECT_EQ(closelevdb_r(nullptr), 0);
		EXPECT_EQ(g_init_calls, 3) << "a started database does not read the configuration again";
		EXPECT_EQ(closecatdb_r(nullptr), 0);
		EXPECT_EQ(g_init_calls, 4) << "each database starts on its own";
	});
}

// Names that ask for no plug-in: the prefix is tested in any case, and
// only for its first seven letters.
class NoPluginName : public testing::TestWithParam<const char *> {};

TEST_P(NoPluginName, EveryForwardedCallFailsWithEnosys)
{
	in_fresh_process([] {
		configure_all(GetParam(), "UTF-8");
		int h = 0;
		char n[] = "x";
		const levent_t lev{n, 1};
		const catent_t cat{n, 1};
		const macent_t mac{n, 0, 0, 0, 0};
		::testing::internal::CaptureStderr();
		const struct {
			const char *what;
			bool failed;
		} calls[] = {
			{"openlevdb_r", failed_with(openlevdb_r() == nullptr, ENOSYS)},
			{"setlevent_r", failed_with(setlevent_r(&h) == -1, ENOSYS)},
			{"getlevent_r", failed_with(getlevent_r(&h) == nullptr, ENOSYS)},
			{"getlevnam_r", failed_with(getlevnam_r(&h, "x") == nullptr, ENOSYS)},
			{"rmlevval_r", failed_with(rmlevval_r(&h, 1) == -1, ENOSYS)},
			{"putlevent_r", failed_with(putlevent_r(&h, &lev) == -1, ENOSYS)},
			{"opencatdb_r", failed_with(opencatdb_r() == nullptr, ENOSYS)},
			{"getcatval_r", failed_with(getcatval_r(&h, 3) == nullptr, ENOSYS)},
			{"putcatent_r", failed_with(putcatent_r(&h, &cat) == -1, ENOSYS)},
			{"closemacdb_r", failed_with(closemacdb_r(&h) == -1, ENOSYS)},
			{"getmacuid_r", failed_with(getmacuid_r(&h, 0) == nullptr, ENOSYS)},
			{"putmacent_r", failed_with(putmacent_r(&h, &mac) == -1, ENOSYS)},
			{"rmmacnam_r", failed_with(rmmacnam_r(&h, "root") == -1, ENOSYS)},
			{"getlchuid", failed_with(getlchuid(0, nullptr) == -1, EOPNOTSUPP)}, // the hooks' own errno
		};
		EXPECT_EQ(::testing::internal::GetCapturedStderr(), "") << "no plug-in is sought";
		for (const auto &c : calls)
			EXPECT_TRUE(c.failed) << c.what;
		EXPECT_EQ(g_init_calls, 3) << "one start-up per database, never repeated";
	});
}

INSTANTIATE_TEST_SUITE_P(Names, NoPluginName, testing::Values("", "FiLeSeS", "filesesX"));

TEST(Startup, MissingPluginIsReportedOnEachAttempt)
{
	in_fresh_process([] {
		// "filese" is shorter than the reserved prefix: a plug-in is sought.
		set_field(dbroute_cfg.lev_backend, "filese");
		::testing::internal::CaptureStderr();
		for (int i = 0; i < 3; ++i)
			EXPECT_EQ(openlevdb_r(), nullptr);
		const std::string err = ::testing::internal::GetCapturedStderr();
		const std::string line = err.substr(0, err.find('\n') + 1);
		EXPECT_NE(line.find("libtavrel-mac-db-filese.so.2"), std::string::npos) << err;
		EXPECT_EQ(err, line + line + line) << "one line per attempt";
		EXPECT_EQ(g_init_calls, 3) << "each failed start-up is tried again from the configuration";
	});
}

// ---- binding and forwarding ----

TEST(Slots, MissingEntriesFailAloneWithEnosys)
{
	in_fresh_process([] {
		configure_all("partial", "UTF-8");
		dbroute_cfg.mac_default_entry = 1; // yet no default entry stands in for a missing entry
		EXPECT_TRUE(failed_with(getlevval_r(nullptr, 1) == nullptr, ENOSYS));
		EXPECT_TRUE(failed_with(rmcatval_r(nullptr, 1) == -1, ENOSYS));
		EXPECT_TRUE(failed_with(getmacuid_r(nullptr, 0) == nullptr, ENOSYS));
		EXPECT_TRUE(failed_with(setlchuid(3999999, nullptr) == -1, EOPNOTSUPP)) << "no user is looked up";
		EXPECT_EQ(levexstval(nullptr, 1), 1) << "ENOSYS is no EILSEQ: the value counts as unknown";
		// The entries that exist are called.
		EXPECT_TRUE(failed_with(getlevnam_r(nullptr, "low") == nullptr, ENOENT));
		EXPECT_EQ(getlchuid(0, nullptr), 7);
	});
}

TEST(Forwarding, HandlesRecordsAndResultsPassUntouched)
{
	with_memtest([] {
		knob(memtest::kCloseResult, 5);
		knob(memtest::kSetResult, -3);
		knob(memtest::kPutResult, 6);
		EXPECT_EQ(closelevdb_r(nullptr), 5) << "a NULL handle is forwarded like any other";
		EXPECT_EQ(setcatent_r(nullptr), -3);
		EXPECT_EQ(endmacent_r(nullptr), 0);
		// Neither a NULL record nor a NULL name in it stops a put.
		const levent_t nameless{nullptr, 1};
		EXPECT_EQ(putlevent_r(nullptr, nullptr), 6);
		EXPECT_EQ(putmacent_r(nullptr, nullptr), 6);
		EXPECT_EQ(putlevent_r(nullptr, &nameless), 6);
		EXPECT_EQ(log(), "closelevdb_r #null \nsetcatent_r #null \nendmacent_r #null \nputlevent_r #null <null-record>\n"
				 "putmacent_r #null <null-record>\nputlevent_r #null <null-name>\n");
		knob(memtest::kOpenErrno, EACCES);
		EXPECT_TRUE(failed_with(openmacdb_r() == nullptr, EACCES));
	});
}

TEST(Forwarding, NullNamesNeverReachThePlugin)
{
	with_memtest([] {
		errno = 4242;
		EXPECT_EQ(getlevnam_r(nullptr, nullptr), nullptr);
		EXPECT_EQ(rmlevnam_r(nullptr, nullptr), -1);
		EXPECT_EQ(getcatnam_r(nullptr, nullptr), nullptr);
		EXPECT_EQ(rmmacnam_r(nullptr, nullptr), -1);
		EXPECT_EQ(getmacnam_r(nullptr, nullptr), nullptr);
		EXPECT_EQ(errno, 4242) << "errno is not touched";
		EXPECT_EQ(log(), "");
	});
}

// ---- charset conversion ----

TEST(Charset, NamesAreConvertedBothWays)
{
	with_memtest(
		[] {
			memtest_ctl_add_lev(kSecretKoi8, 3);
			const std::string back = kSecretUtf8 + std::string(":3");
			// Towards the caller: lookups by value, by name and the walk.
			EXPECT_EQ(take(getlevval_r(nullptr, 3)), back);
			EXPECT_EQ(take(getlevnam_r(nullptr, kSecretUtf8)), back);
			void *db = openlevdb_r();
			EXPECT_EQ(take(getlevent_r(db)), back);
			closelevdb_r(db);
			// Towards the back-end: names and a copy of the record, while
			// the caller's record stays as it was.
			char name[32];
			std::strcpy(name, kSecretUtf8);
			const levent_t mine{name, 7};
			memtest_ctl_clear_log();
			EXPECT_EQ(putlevent_r(nullptr, &mine), 0);
			EXPECT_EQ(rmlevnam_r(nullptr, kSecretUtf8), 0);
			// The category database has its own (equal) charset.
			EXPECT_EQ(getcatnam_r(nullptr, kSecretUtf8), nullptr);
			const std::string koi = kSecretKoi8;
			EXPECT_EQ(log(), "putlevent_r #null [" + koi + "]\nrmlevnam_r #null [" + koi + "]\ngetcatnam_r #null [" +
						 kSecretUtf8 + "]\n");
			EXPECT_EQ(mine.name, name);
			EXPECT_STREQ(name, kSecretUtf8);
		},
		"KOI8-R");
}

TEST(Charset, CharsetsDifferingInCaseNeedNoConversion)
{
	with_memtest(
		[] {
			char name[] = "plain";
			const levent_t mine{name, 1};
			EXPECT_EQ(putlevent_r(nullptr, &mine), 0);
			EXPECT_EQ(memtest_ctl_last_record(), &mine) << "the caller's own record reaches the plug-in";
			EXPECT_EQ(getlevnam_r(nullptr, name), nullptr);
			EXPECT_EQ(memtest_ctl_last_name(), name) << "and so does the caller's own name";
		},
		"utf-8");
}

// A charset that iconv does not know, and text that has no form in the
// other charset, fail nothing: names go out as plain copies and come back
// as the back-end wrote them.
TEST(Charset, RefusedConversionsFallBack)
{
	with_memtest(
		[] {
			memtest_ctl_add_lev(kSecretKoi8, 4);
			memtest_ctl_add_cat("caf\xe9", 1); // not ASCII: can't come back converted
			char name[] = "plain";
			EXPECT_EQ(getlevnam_r(nullptr, name), nullptr);
			EXPECT_NE(memtest_ctl_last_name(), name) << "a copy goes out";
			EXPECT_EQ(getcatnam_r(nullptr, kSecretUtf8), nullptr); // no ASCII form: a plain copy
			EXPECT_NE(memtest_ctl_last_name(), kSecretUtf8);
			EXPECT_EQ(log(), std::string("getlevnam_r #null [plain]\ngetcatnam_r #null [") + kSecretUtf8 + "]\n");
			EXPECT_EQ(take(getlevval_r(nullptr, 4)), kSecretKoi8 + std::string(":4"));
			EXPECT_EQ(take(getcatval_r(nullptr, 1)), "caf\xe9:1");
		},
		"NO-SUCH-CHARSET-42", "ASCII");
}

TEST(Charset, LongLocaleCharsetNamesAreCutTo31Characters)
{
	// 40 characters; only the first 31 are kept at start-up.
	static const char kLong[] = "X-VERY-LONG-CHARSET-NAME-ABCDEFGHIJKLMNO";
	const std::pair<std::string, bool> cases[] = {{std::string(kLong, 31), false}, {kLong, true}};
	for (const auto &[backend_charset, converts] : cases) {
		in_fresh_process([&] {
			g_codeset_override = kLong;
			configure_all("memtest", backend_charset.c_str());
			char name[] = "n";
			EXPECT_EQ(getlevnam_r(nullptr, name), nullptr);
			// Converting means a copy (a plain one: iconv knows neither name).
			EXPECT_EQ(memtest_ctl_last_name() != name, converts);
		});
	}
}

} // namespace
