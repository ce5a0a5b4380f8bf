// The name databases through the switch, against the memtest plug-ins. This
// program defines the configuration block and dbroute_init, so libvyr binds
// to this stand-in; start-up state lasts as long as a process, so every test
// body runs in a fresh child process.
#include <vyr/namedb.h>

#include "contract/dbroute.h"
#include "namedb/plugins/memtest.h"
#include "support/entries.hh"
#include "support/failalloc.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <clocale>
#include <cstdio>
#include <cstring>
#include <dlfcn.h>
#include <functional>
#include <langinfo.h>
#include <pwd.h>
#include <string>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

using vyr_test::failed_with;
using vyr_test::take;

namespace {
int g_init_calls = 0;            // calls of dbroute_init so far
int g_init_result = 0;           // its answer; a negative one fails with EIO
const char *g_codeset = nullptr; // when set, the locale charset libvyr is told
} // namespace

extern "C" {
dbroute_cfg_t dbroute_cfg;

int dbroute_init(void) noexcept {
	++g_init_calls;
	if (g_init_result < 0)
		errno = EIO;
	return g_init_result;
}

char *nl_langinfo(nl_item item) noexcept {
	static const auto real = reinterpret_cast<char *(*)(nl_item)>(dlsym(RTLD_NEXT, "nl_langinfo"));
	return item == CODESET && g_codeset ? const_cast<char *>(g_codeset) : real(item);
}

// The system's user database keeps caches that the failing allocator would
// count: this one knows only root, in one block.
struct passwd *zenk_getpwuid(uint32_t uid) noexcept {
	auto *pw = uid == 0 ? static_cast<struct passwd *>(std::calloc(1, sizeof(struct passwd) + 5)) : nullptr;
	if (pw)
		pw->pw_name = std::strcpy(reinterpret_cast<char *>(pw + 1), "root");
	errno = uid == 0 ? errno : ENOENT;
	return pw;
}

int __lsan_do_recoverable_leak_check() __attribute__((weak)); // sanitizer builds only
}

namespace {

using namespace memtest;

// "Секрет" in the locale's UTF-8 and in KOI8-R.
constexpr const char *kSecretUtf8 = "\xd0\xa1\xd0\xb5\xd0\xba\xd1\x80\xd0\xb5\xd1\x82";
constexpr const char *kSecretKoi8 = "\xf3\xc5\xcb\xd2\xc5\xd4";
constexpr uint32_t kNoSuchUid = 3999999;

void set_field(char (&field)[DBROUTE_NAME_MAX], const std::string &value) {
	std::memset(field, 0, sizeof field);
	value.copy(field, sizeof field - 1);
}

void configure_all(const char *backend, const char *charset) {
	for (auto *f : {&dbroute_cfg.mac_backend, &dbroute_cfg.lev_backend, &dbroute_cfg.cat_backend})
		set_field(*f, backend);
	for (auto *f : {&dbroute_cfg.mac_charset, &dbroute_cfg.lev_charset, &dbroute_cfg.cat_charset})
		set_field(*f, charset);
}

// Runs body in a forked child, which must end without failure or leak
// (_exit skips the sanitizer's own leak check).
void in_fresh_process(const std::function<void()> &body) {
	std::fflush(nullptr);
	const pid_t pid = fork();
	if (pid == 0) {
		body();
		if (__lsan_do_recoverable_leak_check && __lsan_do_recoverable_leak_check() != 0)
			ADD_FAILURE() << "memory leaked in the child process";
		std::fflush(nullptr);
		_exit(::testing::Test::HasFailure() ? 1 : 0);
	}
	int status = 0;
	ASSERT_EQ(waitpid(pid, &status, 0), pid);
	EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << "the child failed (see above)";
}

// A fresh process in C.UTF-8 with every database on memtest, the user and
// level databases in `charset`, the category one in `cat_charset`, started
// ahead (a NULL name reaches no plug-in) so that sweeps don't count the
// plug-in's blocks.
void with_memtest(const char *charset, const char *cat_charset, const std::function<void()> &body) {
	in_fresh_process([&] {
		ASSERT_NE(std::setlocale(LC_ALL, "C.UTF-8"), nullptr);
		configure_all("memtest", cat_charset);
		set_field(dbroute_cfg.mac_charset, charset);
		set_field(dbroute_cfg.lev_charset, charset);
		getmacnam_r(nullptr, nullptr), getlevnam_r(nullptr, nullptr), getcatnam_r(nullptr, nullptr);
		body();
	});
}
void with_memtest(const std::function<void()> &body) { with_memtest("UTF-8", "UTF-8", body); }

std::string log() { return memtest_ctl_log(); }
void knob(Knob k, long long v) { memtest_ctl_knob(k, v); }

// The results of `call` with each of its allocations failing in turn, the
// last with none failing, after a warm-up call that loads what stays cached
// (charset modules). Under a sanitizer strdup escapes the failing
// allocator: `strdup_point` is then dropped from `want`.
template <class Call>
void expect_sweep(Call &&call, std::vector<std::string> want, size_t strdup_point) {
	take(call());
	std::vector<std::string> got;
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) { got.push_back(take(inj.run(call))); });
	vyr_test::Injector probe(1);
	char *p = probe.run([] { return strdup("x"); });
	if (p && strdup_point < want.size())
		want.erase(want.begin() + static_cast<long>(strdup_point));
	std::free(p);
	EXPECT_EQ(got, want);
}

// ---- start-up, slots, forwarding ----

TEST(Startup, FailedConfigurationIsRetriedOnEveryCall) {
	in_fresh_process([] {
		configure_all("memtest", "UTF-8");
		g_init_result = -1;
		EXPECT_TRUE(failed_with(openlevdb_r() == nullptr, EIO)) << "errno as the configuration left it";
		EXPECT_EQ(closelevdb_r(nullptr), -1);
		g_init_result = 0;
		EXPECT_EQ(closelevdb_r(openlevdb_r()) + closelevdb_r(nullptr), 0);
		EXPECT_EQ(g_init_calls, 3) << "retried until started, then never again";
		EXPECT_EQ(closecatdb_r(nullptr), 0);
		EXPECT_EQ(g_init_calls, 4) << "each database starts on its own";
	});
}

// Empty names and names beginning with "fileses" (any case; only its seven
// letters count) ask for no plug-in: every forwarded call fails.
TEST(Startup, NoPluginNamesFailEveryCallWithEnosys) {
	for (const char *name : {"", "FiLeSeS", "filesesX"}) {
		in_fresh_process([name] {
			configure_all(name, "UTF-8");
			int h = 0;
			char n[] = "x";
			// Category records must stand for one bit, checked before start-up.
			EXPECT_TRUE(failed_with(putcatent_r(nullptr, nullptr) == -1, EINVAL));
			for (uint64_t bad : {0ull, 3ull, 0x8000000000000001ull}) {
				const catent_t e{n, bad};
				EXPECT_TRUE(failed_with(putcatent_r(nullptr, &e) == -1, EINVAL)) << bad;
			}
			EXPECT_EQ(is_cats_valid(nullptr, 0) + g_init_calls, 0) << "an empty mask needs no database";
			const catent_t one_bit{n, 0x8000000000000000ull}, low_bit{n, 1};
			::testing::internal::CaptureStderr();
			const bool failed[] = {
				failed_with(setlevent_r(&h) == -1, ENOSYS),          failed_with(getlevent_r(&h) == nullptr, ENOSYS),
				failed_with(getlevnam_r(&h, "x") == nullptr, ENOSYS), failed_with(rmlevval_r(&h, 1) == -1, ENOSYS),
				failed_with(getcatval_r(&h, 3) == nullptr, ENOSYS),  failed_with(putcatent_r(&h, &one_bit) == -1, ENOSYS),
				failed_with(putcatent_r(&h, &low_bit) == -1, ENOSYS),
				failed_with(is_cats_valid(nullptr, 1) == -1, ENOSYS), failed_with(rmmacnam_r(&h, "root") == -1, ENOSYS),
				failed_with(getlchuid(0, nullptr) == -1, EOPNOTSUPP), // the hooks' own errno
			};
			EXPECT_EQ(::testing::internal::GetCapturedStderr(), "") << "no plug-in is sought";
			for (size_t i = 0; i < std::size(failed); ++i)
				EXPECT_TRUE(failed[i]) << "call " << i << ", back-end '" << name << "'";
			EXPECT_EQ(g_init_calls, 3) << "one start-up per database, never repeated";
		});
	}
}

TEST(Startup, MissingPluginIsReportedOnEachAttempt) {
	in_fresh_process([] {
		set_field(dbroute_cfg.lev_backend, "filese"); // shorter than the prefix: a plug-in is sought
		::testing::internal::CaptureStderr();
		for (int i = 0; i < 3; ++i)
			EXPECT_EQ(openlevdb_r(), nullptr);
		const std::string err = ::testing::internal::GetCapturedStderr();
		const std::string line = err.substr(0, err.find('\n') + 1);
		EXPECT_NE(line.find("libtavrel-mac-db-filese.so.2"), std::string::npos) << err;
		EXPECT_EQ(err, line + line + line) << "one dlerror line per attempt";
		EXPECT_EQ(g_init_calls, 3) << "each failed start-up is tried again";
	});
}

TEST(Slots, MissingEntriesFailAloneWithEnosys) {
	in_fresh_process([] {
		configure_all("partial", "UTF-8");
		dbroute_cfg.mac_default_entry = 1; // yet no default entry stands in for a missing entry
		EXPECT_TRUE(failed_with(getlevval_r(nullptr, 1) == nullptr, ENOSYS));
		EXPECT_TRUE(failed_with(rmcatval_r(nullptr, 1) == -1, ENOSYS));
		EXPECT_TRUE(failed_with(getmacuid_r(nullptr, 0) == nullptr, ENOSYS));
		EXPECT_TRUE(failed_with(setlchuid(kNoSuchUid, nullptr) == -1, EOPNOTSUPP)) << "no user is looked up";
		EXPECT_EQ(levexstval(nullptr, 1), 1) << "ENOSYS is no EILSEQ: the value counts as unknown";
		EXPECT_TRUE(failed_with(getlevnam_r(nullptr, "low") == nullptr, ENOENT)) << "present entries are called";
		EXPECT_EQ(getlchuid(0, nullptr), 7);
	});
}

// Handles, records, values and results pass untouched; NULL names stop
// before the plug-in, errno untouched.
TEST(Forwarding, ArgumentsAndResultsPassUntouched) {
	with_memtest([] {
		knob(kCloseResult, 5);
		knob(kSetResult, -3);
		knob(kPutResult, 6);
		const levent_t nameless{nullptr, 1};
		EXPECT_EQ(closelevdb_r(nullptr), 5);
		EXPECT_EQ(setcatent_r(nullptr), -3);
		EXPECT_EQ(putmacent_r(nullptr, nullptr), 6);
		EXPECT_EQ(putlevent_r(nullptr, &nameless), 6);
		EXPECT_EQ(getcatval_r(nullptr, 0xf0f0000000000001ull), nullptr);
		EXPECT_EQ(rmcatval_r(nullptr, 0x300), -1);
		EXPECT_EQ(getlevval_r(nullptr, 0x102), nullptr) << "levels by their low 8 bits";
		errno = 4242;
		EXPECT_EQ(getlevnam_r(nullptr, nullptr), nullptr);
		EXPECT_EQ(rmlevnam_r(nullptr, nullptr), -1);
		EXPECT_EQ(errno, 4242);
		EXPECT_EQ(log(), "closelevdb_r #null \nsetcatent_r #null \nputmacent_r #null <null-record>\n"
				 "putlevent_r #null <null-name>\ngetcatval_r #null 17361376563513262081\n"
				 "rmcatval_r #null 768\ngetlevval_r #null 2\n");
		knob(kOpenErrno, EACCES);
		EXPECT_TRUE(failed_with(openmacdb_r() == nullptr, EACCES));
	});
}

// ---- charset conversion ----

TEST(Charset, NamesAreConvertedBothWays) {
	with_memtest("KOI8-R", "UTF-8", [] {
		memtest_ctl_add_lev(kSecretKoi8, 3);
		const std::string back = kSecretUtf8 + std::string(":3"), koi = kSecretKoi8;
		EXPECT_EQ(take(getlevval_r(nullptr, 3)), back);
		EXPECT_EQ(take(getlevnam_r(nullptr, kSecretUtf8)), back);
		void *db = openlevdb_r();
		EXPECT_EQ(take(getlevent_r(db)), back);
		closelevdb_r(db);
		// Towards the back-end a converted copy; the caller's record stays.
		char name[32];
		const levent_t mine{std::strcpy(name, kSecretUtf8), 7};
		memtest_ctl_clear_log();
		EXPECT_EQ(putlevent_r(nullptr, &mine), 0);
		EXPECT_EQ(rmlevnam_r(nullptr, kSecretUtf8), 0);
		EXPECT_EQ(getcatnam_r(nullptr, kSecretUtf8), nullptr); // the category database is UTF-8
		dbroute_cfg.mac_default_entry = 1; // a default entry keeps the caller's text
		EXPECT_EQ(take(getmacnam_r(nullptr, kSecretUtf8)), kSecretUtf8 + std::string(":0:0:0:0"));
		EXPECT_EQ(log(), "putlevent_r #null [" + koi + "]\nrmlevnam_r #null [" + koi + "]\ngetcatnam_r #null [" +
					 kSecretUtf8 + "]\ngetmacnam_r #null [" + koi + "]\n");
		EXPECT_TRUE(mine.name == name && std::strcmp(name, kSecretUtf8) == 0);
	});
}

// Charsets are compared without case and the locale's name is cut to 31
// characters; without conversion the caller's own record and name go out.
TEST(Charset, ConversionOnlyBetweenDifferentCharsets) {
	static const char kLong[] = "X-VERY-LONG-CHARSET-NAME-ABCDEFGHIJKLMNO"; // 40 characters
	const struct {
		const char *locale, *backend;
		bool converts;
	} cases[] = {{nullptr, "utf-8", false}, {kLong, "X-VERY-LONG-CHARSET-NAME-ABCDEF", false}, {kLong, kLong, true}};
	for (const auto &c : cases) {
		in_fresh_process([&] {
			ASSERT_NE(std::setlocale(LC_ALL, "C.UTF-8"), nullptr);
			g_codeset = c.locale;
			configure_all("memtest", c.backend);
			char name[] = "n";
			const levent_t mine{name, 1};
			EXPECT_EQ(getlevnam_r(nullptr, name), nullptr);
			EXPECT_EQ(memtest_ctl_last_arg() != name, c.converts) << c.backend;
			EXPECT_EQ(putlevent_r(nullptr, &mine), 0);
			EXPECT_EQ(memtest_ctl_last_arg() != &mine, c.converts) << c.backend;
		});
	}
}

// An unknown charset, and text without a form in the other charset, fail
// nothing: names go out as plain copies and come back as stored.
TEST(Charset, RefusedConversionsFallBack) {
	with_memtest("NO-SUCH-CHARSET-42", "ASCII", [] {
		memtest_ctl_add_lev(kSecretKoi8, 4);
		memtest_ctl_add_cat("caf\xe9", 1);
		EXPECT_EQ(getcatnam_r(nullptr, kSecretUtf8), nullptr);
		EXPECT_NE(memtest_ctl_last_arg(), kSecretUtf8) << "a copy goes out";
		EXPECT_EQ(log(), std::string("getcatnam_r #null [") + kSecretUtf8 + "]\n");
		EXPECT_EQ(take(getlevval_r(nullptr, 4)), kSecretKoi8 + std::string(":4"));
		EXPECT_EQ(take(getcatval_r(nullptr, 1)), "caf\xe9:1");
	});
}

// ---- value checks, default entries, lch hooks ----

// On the caller's handle, or on one opened and closed for the check, whose
// failure fails it; EILSEQ declares a value known; a mask is tried bit by
// bit upward and stops at the first unknown bit.
TEST(Values, ExistenceTests) {
	with_memtest([] {
		memtest_ctl_add_lev("two", 2);
		memtest_ctl_add_cat("a", 1);
		memtest_ctl_add_cat("top", 0x8000000000000000ull);
		knob(kEilseqValue, 2);
		void *lev = openlevdb_r(), *cat = opencatdb_r();
		memtest_ctl_clear_log();
		EXPECT_EQ(levexstval(lev, 0x102), 0);
		EXPECT_EQ(levexstval(lev, 3), 1);
		EXPECT_EQ(is_cats_valid(cat, 0x8000000000000003ull), 0);
		EXPECT_EQ(is_cats_valid(cat, 0x8000000000000009ull), 1);
		EXPECT_EQ(log(), "getlevval_r #1 2\ngetlevval_r #1 3\ngetcatval_r #2 1\ngetcatval_r #2 2\n"
				 "getcatval_r #2 9223372036854775808\ngetcatval_r #2 1\ngetcatval_r #2 8\n");
		closelevdb_r(lev), closecatdb_r(cat);
		memtest_ctl_clear_log();
		EXPECT_EQ(levexstval(nullptr, 2), 0);
		EXPECT_EQ(log(), "openlevdb_r #3 \ngetlevval_r #3 2\ncloselevdb_r #3 \n");
		knob(kCloseResult, 1);
		EXPECT_EQ(levexstval(nullptr, 2) + is_cats_valid(nullptr, 1), -2) << "a failed close overrides the answer";
		knob(kCloseResult, 0);
		knob(kOpenErrno, EACCES);
		EXPECT_EQ(levexstval(nullptr, 2), -1);
		EXPECT_EQ(memtest_ctl_live_handles(), 0);
	});
}

// A user the plug-in lacks gets an all-zero entry when the configuration
// asks for one and the plug-in said ENOENT or ENODATA; by uid only for a
// user the system knows.
TEST(Users, DefaultEntryTable) {
	const struct {
		uint32_t on;
		int miss;
		bool made;
	} cases[] = {{1, ENOENT, true}, {1, ENODATA, true}, {1, EIO, false}, {0, ENOENT, false}};
	for (const auto &c : cases) {
		with_memtest([&] {
			dbroute_cfg.mac_default_entry = c.on;
			knob(kMissErrno, c.miss);
			errno = 0;
			EXPECT_EQ(take(getmacnam_r(nullptr, "nobody-at-all")), c.made ? "nobody-at-all:0:0:0:0" : "null");
			EXPECT_EQ(errno, c.miss) << "the back-end's errno stays";
			EXPECT_EQ(take(getmacuid_r(nullptr, 0)), c.made ? "root:0:0:0:0" : "null");
			EXPECT_EQ(errno, c.made ? 0 : c.miss);
			EXPECT_EQ(getmacuid_r(nullptr, kNoSuchUid), nullptr);
		});
	}
}

TEST(Users, LchHooksGetTheUserRecord) {
	with_memtest([] {
		knob(kLchResult, 11);
		int token = 0;
		char arg[40];
		std::snprintf(arg, sizeof arg, " arg=%p\n", static_cast<void *>(&token));
		EXPECT_EQ(getlchnam("root", &token), 11);
		EXPECT_EQ(setlchuid(0, &token), 11);
		EXPECT_TRUE(failed_with(setlchnam("no-such-user-here", &token) == -1, ENOENT)) << "as the lookup left it";
		EXPECT_EQ(getlchuid(kNoSuchUid, &token), -1);
		EXPECT_EQ(log(), std::string("do_getlch #null [root]") + arg + "do_setlch #null [root]" + arg)
			<< "no hook runs without a user";
	});
}

// ---- static-result layer ----

// A walk starts by itself and keeps its handle past the end until endlevent;
// lookups share a held handle and otherwise open and close one, whose close
// keeps the lookup's errno; a failed start leaves nothing open.
TEST(StaticLayer, HiddenHandle) {
	with_memtest([] {
		memtest_ctl_add_lev("low", 1);
		memtest_ctl_add_lev("high", 2);
		EXPECT_TRUE(failed_with(getlevnam("none") == nullptr, ENOENT));
		EXPECT_EQ(getlevnam("low")->value, 1);
		EXPECT_STREQ(getlevent()->name, "low");
		EXPECT_STREQ(getlevval(0x102)->name, "high");
		EXPECT_STREQ(getlevent()->name, "high");
		EXPECT_EQ(getlevent(), nullptr);
		EXPECT_EQ(getlevent(), nullptr);
		knob(kCloseResult, 4);
		EXPECT_EQ(endlevent(), 4);
		EXPECT_STREQ(getlevent()->name, "low");
		EXPECT_EQ(log(), "openlevdb_r #1 \ngetlevnam_r #1 [none]\ncloselevdb_r #1 \nopenlevdb_r #2 \n"
				 "getlevnam_r #2 [low]\ncloselevdb_r #2 \nopenlevdb_r #3 \nsetlevent_r #3 \ngetlevent_r #3 \n"
				 "getlevval_r #3 2\ngetlevent_r #3 \ngetlevent_r #3 \ngetlevent_r #3 \nendlevent_r #3 \n"
				 "closelevdb_r #3 \nopenlevdb_r #4 \nsetlevent_r #4 \ngetlevent_r #4 \n");
		EXPECT_EQ(endlevent(), 4);
		knob(kSetResult, -1);
		EXPECT_EQ(setcatent(), -1);
		EXPECT_EQ(getcatent(), nullptr);
		EXPECT_EQ(memtest_ctl_live_handles(), 0);
	});
}

// Writers give -1 for a failed open; the level writer alone turns success
// into 0. Every entry-returning function has its own static record, with
// names cut to 1023 bytes.
TEST(StaticLayer, WritersAndResults) {
	with_memtest([] {
		char n[] = "x";
		const levent_t lev{n, 1};
		const catent_t cat{n, 1};
		knob(kPutResult, 5);
		EXPECT_EQ(putlevent(&lev), 0);
		EXPECT_EQ(putcatent(&cat), 5);
		knob(kPutResult, -2);
		EXPECT_EQ(putlevent(&lev), -1);
		EXPECT_EQ(putcatent(&cat), -2);
		memtest_ctl_add_lev("one", 1);
		EXPECT_EQ(rmlevval(0x101), 0);
		EXPECT_EQ(rmlevval(1), -1);
		dbroute_cfg.mac_default_entry = 1;
		memtest_ctl_add_mac("bob", 5, 6, 7, 8, 501);
		memtest_ctl_add_mac("alice", 1, 2, 3, 4, 500);
		macent_t *by_name = getmacnam("alice"), *by_uid = getmacuid(0) /* root's default */, *walked = getmacent();
		ASSERT_TRUE(by_name && by_uid && walked);
		EXPECT_EQ(std::string(by_name->name) + by_uid->name + walked->name + std::to_string(by_name->cat2), "aliceroot"
			  "bob4");
		EXPECT_EQ(getmacnam("alice"), by_name) << "the same function reuses its record";
		const std::string fits(1023, 'f'), cut(1024, 'c');
		memtest_ctl_add_cat(fits.c_str(), 1);
		memtest_ctl_add_cat(cut.c_str(), 2);
		EXPECT_EQ(getcatval(1)->name, fits);
		EXPECT_EQ(getcatval(2)->name, cut.substr(0, 1023));
		endmacent();
		knob(kOpenErrno, EACCES);
		EXPECT_EQ(putcatent(&cat) + rmcatval(1), -2);
		EXPECT_EQ(memtest_ctl_live_handles(), 0);
	});
}

// ---- wide-character layer ----

TEST(WideLayer, EntriesComeOutWideAndNamesGoInNarrow) {
	with_memtest([] {
		EXPECT_TRUE(failed_with(wcfreecatent(nullptr) == -1, EINVAL));
		memtest_ctl_add_mac("\xd0\xaf", 9, 0x99, 8, 0x88, 42); // "Я"
		memtest_ctl_add_lev("\xd0\xaf", 1);
		void *mac = openmacdb_r();
		ASSERT_EQ(wcsetmacent(mac), 0);
		EXPECT_EQ(take(wcgetmacent(mac)), "\xd0\xaf:9:153:8:136");
		EXPECT_EQ(take(wcgetmacuid(mac, 42)), "\xd0\xaf:9:153:8:136");
		EXPECT_EQ(take(wcgetmacnam(mac, L"\u042f")), "\xd0\xaf:9:153:8:136");
		closemacdb_r(mac);
		EXPECT_EQ(take(wcgetlevval(nullptr, 0x101)), "\xd0\xaf:1");
		wchar_t name[] = L"\u042f";
		const wclevent_t w{name, 4};
		const wchar_t bad[] = {static_cast<wchar_t>(0xd800), 0}; // no multibyte form: refused before the plug-in
		memtest_ctl_clear_log();
		EXPECT_EQ(wcputlevent(nullptr, &w), 0);
		EXPECT_EQ(wcputlevent(nullptr, nullptr), 0) << "a NULL record reaches no plug-in";
		EXPECT_EQ(wcrmlevnam(nullptr, L"\u042f"), 0);
		EXPECT_EQ(wcrmlevval(nullptr, 0x101), -1);
		EXPECT_EQ(wcgetlevnam(nullptr, bad), nullptr);
		EXPECT_EQ(log(), "putlevent_r #null [\xd0\xaf]\nrmlevnam_r #null [\xd0\xaf]\nrmlevval_r #null 1\n");
		EXPECT_EQ(w.name, name);
	});
}

// ---- allocation failure: the failure values, and nothing leaked ----

// Way out failing: nothing; way back failing: the stored bytes stand in.
// How many allocations each way takes is the converter's business.
TEST(AllocFailure, ConvertedLookupByName) {
	with_memtest("KOI8-R", "UTF-8", [] {
		memtest_ctl_add_lev(kSecretKoi8, 3);
		take(getlevnam_r(nullptr, kSecretUtf8));
		std::string got;
		vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			const std::string r = take(inj.run([] { return getlevnam_r(nullptr, kSecretUtf8); }));
			got += r == "null" ? "n" : r == kSecretKoi8 + std::string(":3") ? "s" : r == kSecretUtf8 + std::string(":3") ? "c" : "?";
		});
		EXPECT_TRUE(got.find_first_not_of('n') > 0 && got.find("ns") != got.npos && got.ends_with("sc") &&
			    got.find_first_of("c?") == got.size() - 1)
			<< got;
	});
}

// A default entry is the entry, then a copy of the name (the uid lookup
// fetches the user first); a failed copy still gives the entry, nameless.
// A wide lookup is the narrow name, the plug-in's record and name, the wide
// record and last the wide name, which alone may fail without failing the
// call; a wide put may end up putting NULL.
TEST(AllocFailure, DefaultEntriesLchHooksAndWideLayer) {
	with_memtest([] {
		memtest_ctl_add_lev("level", 3);
		expect_sweep([] { return wcgetlevnam(nullptr, L"level"); },
			     {"null", "null", "null", "null", "<null-name>:3", "level:3"}, 0);
		wchar_t wname[] = L"level";
		const wclevent_t wide{wname, 3};
		knob(kPutResult, 6);
		vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			const int r = inj.run([&] { return wcputlevent(nullptr, &wide); });
			EXPECT_TRUE(r == 6 || (inj.fired() && r == 0)) << r;
		});
		dbroute_cfg.mac_default_entry = 1;
		expect_sweep([] { return getmacnam_r(nullptr, "ghost"); }, {"null", "<null-name>:0:0:0:0", "ghost:0:0:0:0"}, 1);
		expect_sweep([] { return getmacuid_r(nullptr, 0); }, {"null", "null", "<null-name>:0:0:0:0", "root:0:0:0:0"}, 2);
		vyr_test::sweep_alloc_failures([](vyr_test::Injector &inj) {
			const int r = inj.run([] { return setlchuid(0, nullptr); });
			EXPECT_EQ(r, inj.fired() ? -1 : 7);
		});
	});
}

// A put calls the entry whatever the copies gave; the caller's record stays.
TEST(AllocFailure, ConvertedRecordCopy) {
	with_memtest("KOI8-R", "UTF-8", [] {
		knob(kPutResult, 3);
		char name[32];
		const levent_t mine{std::strcpy(name, kSecretUtf8), 5};
		putlevent_r(nullptr, &mine);
		vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			EXPECT_EQ(inj.run([&] { return putlevent_r(nullptr, &mine); }), 3);
			EXPECT_TRUE(mine.name == name && std::strcmp(name, kSecretUtf8) == 0);
		});
	});
}

} // namespace
