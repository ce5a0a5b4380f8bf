// The static-result layer (hidden handle, static records) and the
// wide-character layer. The hidden handles are process state too, so each
// test runs in a fresh process.

#include <vyr/namedb.h>

#include "namedb/harness.hh"
#include "support/failalloc.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <clocale>
#include <cstdio>
#include <cstdlib>
#include <string>

using namespace nd_test;

namespace {

// ---- static-result layer ----

TEST(StaticLayer, WalkStartsByItselfAndRestartsAfterEnd)
{
	with_memtest([] {
		memtest_ctl_add_lev("low", 1);
		memtest_ctl_add_lev("high", 2);
		EXPECT_STREQ(getlevent()->name, "low");
		EXPECT_STREQ(getlevent()->name, "high");
		EXPECT_EQ(getlevent(), nullptr);
		EXPECT_EQ(getlevent(), nullptr) << "the end of a walk closes nothing";
		EXPECT_EQ(memtest_ctl_live_handles(), 1);

		knob(memtest::kCloseResult, 4);
		memtest_ctl_clear_log();
		EXPECT_EQ(endlevent(), 4);
		EXPECT_STREQ(getlevent()->name, "low");
		EXPECT_EQ(log(), "endlevent_r #1 \ncloselevdb_r #1 \nopenlevdb_r #2 \nsetlevent_r #2 \ngetlevent_r #2 \n");
	});
}

TEST(StaticLayer, FailedStartLeavesNothingOpen)
{
	with_memtest([] {
		knob(memtest::kSetResult, -1);
		EXPECT_EQ(setcatent(), -1);
		EXPECT_EQ(getcatent(), nullptr);
		EXPECT_EQ(memtest_ctl_live_handles(), 0);
		knob(memtest::kSetResult, 0);
		knob(memtest::kOpenErrno, EACCES);
		EXPECT_TRUE(failed_with(setcatent() == -1, EACCES));
		char n[] = "c";
		const catent_t c{n, 1};
		EXPECT_EQ(putcatent(&c), -1) << "writers give -1 for a failed open";
		EXPECT_EQ(rmcatval(1), -1);
		EXPECT_EQ(getcatnam("c"), nullptr);
	});
}

TEST(StaticLayer, LookupsOpenAndCloseUnlessAHandleIsHeld)
{
	with_memtest([] {
		memtest_ctl_add_lev("one", 1);
		memtest_ctl_add_lev("two", 2);
		EXPECT_EQ(getlevnam("one")->value, 1);
		EXPECT_TRUE(failed_with(getlevnam("none") == nullptr, ENOENT)) << "the lookup's errno survives the close";
		EXPECT_EQ(memtest_ctl_live_handles(), 0);
		EXPECT_EQ(log(), "openlevdb_r #1 \ngetlevnam_r #1 [one]\ncloselevdb_r #1 \n"
				 "openlevdb_r #2 \ngetlevnam_r #2 [none]\ncloselevdb_r #2 \n");

		ASSERT_EQ(setlevent(), 0);
		memtest_ctl_clear_log();
		EXPECT_STREQ(getlevval(0x102)->name, "two"); // level 2, on the held handle
		EXPECT_EQ(getlevval(7), nullptr);
		EXPECT_STREQ(getlevent()->name, "one") << "lookups share the walk's handle";
		EXPECT_EQ(log(), "getlevval_r #3 2\ngetlevval_r #3 7\ngetlevent_r #3 \n");
		EXPECT_EQ(memtest_ctl_live_handles(), 1);
	});
}

TEST(StaticLayer, EachFunctionHasItsOwnResult)
{
	with_memtest([] {
		dbroute_cfg.mac_default_entry = 1;
		memtest_ctl_add_mac("bob", 5, 6, 7, 8, 501);
		memtest_ctl_add_mac("alice", 1, 2, 3, 4, 500);
		macent_t *by_name = getmacnam("alice"), *by_uid = getmacuid(0) /* root's default */, *walked = getmacent();
		ASSERT_TRUE(by_name && by_uid && walked);
		EXPECT_TRUE(by_name != by_uid && by_name != walked && by_uid != walked);
		EXPECT_STREQ(by_name->name, "alice");
		EXPECT_EQ(by_name->cat2, 4u);
		EXPECT_STREQ(by_uid->name, "root");
		EXPECT_STREQ(walked->name, "bob");
		EXPECT_EQ(getmacnam("alice"), by_name) << "the same function reuses its record";
	});
}

TEST(StaticLayer, LongNamesAreCut)
{
	with_memtest([] {
		const std::string fits(1023, 'f'), cut(1024, 'c');
		memtest_ctl_add_cat(fits.c_str(), 1);
		memtest_ctl_add_cat(cut.c_str(), 2);
		EXPECT_EQ(getcatval(1)->name, fits);
		EXPECT_EQ(getcatval(2)->name, cut.substr(0, 1023));
	});
}

TEST(StaticLayer, WriterResults)
{
	with_memtest([] {
		char n[] = "x";
		const levent_t lev{n, 1};
		const catent_t cat{n, 1};
		const macent_t mac{n, 0, 0, 0, 0};
		knob(memtest::kPutResult, 5);
		EXPECT_EQ(putlevent(&lev), 0) << "the level writer turns success into 0";
		EXPECT_EQ(putcatent(&cat), 5);
		EXPECT_EQ(putmacent(&mac), 5);
		knob(memtest::kPutResult, -2);
		EXPECT_EQ(putlevent(&lev), -1);
		EXPECT_EQ(putcatent(&cat), -2);

		memtest_ctl_add_lev("one", 1);
		memtest_ctl_add_mac("x", 0, 0, 0, 0, -1);
		EXPECT_EQ(rmlevval(0x101), 0);
		EXPECT_EQ(rmlevval(1), -1);
		EXPECT_EQ(rmmacnam("x"), 0);
		EXPECT_EQ(memtest_ctl_live_handles(), 0);
	});
}

// ---- wide-character layer ----

TEST(WideLayer, Release)
{
	errno = 0;
	EXPECT_EQ(wcfreecatent(nullptr), -1);
	EXPECT_EQ(errno, EINVAL);
	EXPECT_EQ(wcfreelevent(static_cast<wclevent_t *>(std::calloc(1, sizeof(wclevent_t)))), 0);
}

TEST(WideLayer, EntriesComeOutWide)
{
	with_memtest([] {
		memtest_ctl_add_mac("\xd0\xaf", 9, 0x99, 8, 0x88, 42); // "Я"
		memtest_ctl_add_lev("one", 1);
		void *mac = openmacdb_r();
		ASSERT_EQ(wcsetmacent(mac), 0);
		EXPECT_EQ(take(wcgetmacent(mac)), "\xd0\xaf:9:153:8:136");
		EXPECT_EQ(take(wcgetmacuid(mac, 42)), "\xd0\xaf:9:153:8:136");
		EXPECT_EQ(take(wcgetmacnam(mac, L"\u042f")), "\xd0\xaf:9:153:8:136");
		EXPECT_EQ(wcgetmacent(mac), nullptr);
		EXPECT_EQ(wcendmacent(mac), 0) << "the handle stays usable after the end of a walk";
		closemacdb_r(mac);

		memtest_ctl_clear_log();
		EXPECT_EQ(take(wcgetlevval(nullptr, 0x101)), "one:1");
		EXPECT_EQ(wcrmlevval(nullptr, 0x101), 0);
		EXPECT_EQ(log(), "getlevval_r #null 1\nrmlevval_r #null 1\n");
	});
}

TEST(WideLayer, NamesGoInNarrow)
{
	with_memtest([] {
		memtest_ctl_add_lev("\xd0\xaf", 4);
		wchar_t name[] = L"\u042f";
		const wclevent_t w{name, 4};
		EXPECT_EQ(wcputlevent(nullptr, &w), 0);
		EXPECT_EQ(wcputlevent(nullptr, nullptr), 0);
		EXPECT_EQ(wcrmlevnam(nullptr, L"\u042f"), 0);
		EXPECT_EQ(wcgetlevnam(nullptr, L"missing"), nullptr);
		EXPECT_EQ(log(), "putlevent_r #null [\xd0\xaf]\nrmlevnam_r #null [\xd0\xaf]\ngetlevnam_r #null [missing]\n")
			<< "a NULL record reaches no plug-in";
		EXPECT_EQ(w.name, name);

		// A wide name without a multibyte form travels as NULL, which the
		// layer below refuses before the plug-in.
		const wchar_t bad[] = {static_cast<wchar_t>(0xd800), 0};
		memtest_ctl_clear_log();
		EXPECT_EQ(wcgetlevnam(nullptr, bad), nullptr);
		EXPECT_EQ(wcrmlevnam(nullptr, bad), -1);
		EXPECT_EQ(log(), "");
	});
}

// The stream functions of the three interfaces write the same line, read
// it back alike, and need no database.
TEST(Layers, StreamFunctionsAgree)
{
	in_fresh_process([] {
		ASSERT_NE(std::setlocale(LC_ALL, "C.UTF-8"), nullptr);
		FILE *fp = std::tmpfile();
		ASSERT_NE(fp, nullptr);
		char n[] = "\xd0\xaf";
		const macent_t narrow{n, 1, 0xabc, 2, 0};
		wchar_t wn[] = L"\u042f";
		const wcmacent_t wide{wn, 1, 0xabc, 2, 0};
		EXPECT_EQ(fputmacent_r(fp, &narrow), 13);
		EXPECT_EQ(wcfputmacent(fp, &wide), 13);
		EXPECT_EQ(fputmacent(fp, &narrow), 13);
		std::rewind(fp);
		char text[64] = {};
		EXPECT_EQ(std::fread(text, 1, sizeof text - 1, fp), 39u);
		EXPECT_STREQ(text, "\xd0\xaf:1:abc:2:0\n\xd0\xaf:1:abc:2:0\n\xd0\xaf:1:abc:2:0\n");
		std::rewind(fp);
		EXPECT_EQ(take(fgetmacent_r(fp)), "\xd0\xaf:1:2748:2:0");
		EXPECT_EQ(take(wcfgetmacent(fp)), "\xd0\xaf:1:2748:2:0");
		EXPECT_EQ(fgetmacent(fp)->cat1, 0xabcu);
		std::fclose(fp);
		EXPECT_EQ(g_init_calls, 0);
	});
}

TEST(WideLayer, AllocationFailure)
{
	with_memtest([] {
		memtest_ctl_add_lev("level", 3);
		knob(memtest::kPutResult, 6);
		// The narrow name, the plug-in's record and name, the wide record, and
		// last the wide name, which alone may fail without failing the call.
		EXPECT_EQ(sweep_results([] { return wcgetlevnam(nullptr, L"level"); }),
			  std::string(strdup_can_fail() ? "null | " : "") + "null | null | null | <null-name>:3 | level:3");
		wchar_t name[] = L"level";
		const wclevent_t in{name, 3};
		vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			const int r = inj.run([&] { return wcputlevent(nullptr, &in); });
			EXPECT_TRUE(r == 6 || (inj.fired() && r == 0)) << r;
		});
	});
}

} // namespace
