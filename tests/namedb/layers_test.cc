// The static-result layer (hidden handle, static records) and the
// wide-character layer, through the in-memory test plug-in. Each test runs
// in a fresh process: the hidden handles are process state too.

#include <vyr/namedb.h>

#include "namedb/harness.hh"
#include "support/failalloc.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <cwchar>
#include <string>

using namespace nd_test;

namespace {

void with_memtest(const std::function<void(const Plugin &)> &body)
{
	in_fresh_process([&] {
		use_utf8_locale();
		configure_all("memtest", "UTF-8");
		Plugin p("memtest");
		body(p);
	});
}

std::string read_all(FILE *fp)
{
	std::fflush(fp);
	std::rewind(fp);
	std::string out;
	for (int c; (c = std::fgetc(fp)) != EOF;)
		out += static_cast<char>(c);
	return out;
}

// ---- static-result layer ----

TEST(StaticLayer, WalkStartsByItselfAndRestartsAfterEnd)
{
	with_memtest([](const Plugin &p) {
		p.add_lev("low", 1);
		p.add_lev("high", 2);
		levent_t *e = getlevent();
		ASSERT_NE(e, nullptr);
		EXPECT_STREQ(e->name, "low");
		e = getlevent();
		ASSERT_NE(e, nullptr);
		EXPECT_STREQ(e->name, "high");
		EXPECT_EQ(getlevent(), nullptr);
		EXPECT_EQ(getlevent(), nullptr) << "the end of a walk closes nothing";
		EXPECT_EQ(p.live_handles(), 1);

		p.knob("close_result", 4);
		EXPECT_EQ(endlevent(), 4);
		EXPECT_EQ(p.live_handles(), 0);
		e = getlevent();
		ASSERT_NE(e, nullptr);
		EXPECT_STREQ(e->name, "low");
		EXPECT_EQ(p.log(),
			  "openlevdb_r #1 \nsetlevent_r #1 \ngetlevent_r #1 \ngetlevent_r #1 \ngetlevent_r #1 \n"
			  "getlevent_r #1 \nendlevent_r #1 \ncloselevdb_r #1 \nopenlevdb_r #2 \nsetlevent_r #2 \n"
			  "getlevent_r #2 \n");
	});
}

TEST(StaticLayer, FailedStartLeavesNothingOpen)
{
	with_memtest([](const Plugin &p) {
		p.knob("set_result", -1);
		EXPECT_EQ(setcatent(), -1);
		EXPECT_EQ(getcatent(), nullptr);
		EXPECT_EQ(p.live_handles(), 0);
		p.knob("set_result", 0);
		p.knob("open_errno", EACCES);
		errno = 0;
		EXPECT_EQ(setcatent(), -1);
		EXPECT_EQ(errno, EACCES);
		char n[] = "c";
		const catent_t c{n, 1};
		EXPECT_EQ(putcatent(&c), -1) << "writers give -1 for a failed open";
		EXPECT_EQ(rmcatnam("c"), -1);
		EXPECT_EQ(getcatnam("c"), nullptr);
	});
}

TEST(StaticLayer, LookupsOpenAndCloseUnlessAHandleIsHeld)
{
	with_memtest([](const Plugin &p) {
		p.add_lev("one", 1);
		p.add_lev("two", 2);
		levent_t *e = getlevnam("one");
		ASSERT_NE(e, nullptr);
		EXPECT_EQ(e->value, 1);
		errno = 0;
		EXPECT_EQ(getlevnam("none"), nullptr);
		EXPECT_EQ(errno, ENOENT) << "the lookup's errno survives the close";
		EXPECT_EQ(p.live_handles(), 0);
		EXPECT_EQ(p.log(), "openlevdb_r #1 \ngetlevnam_r #1 [one]\ncloselevdb_r #1 \n"
				   "openlevdb_r #2 \ngetlevnam_r #2 [none]\ncloselevdb_r #2 \n");

		ASSERT_EQ(setlevent(), 0);
		p.clear_log();
		e = getlevval(0x102); // level 2, on the held handle
		ASSERT_NE(e, nullptr);
		EXPECT_STREQ(e->name, "two");
		EXPECT_EQ(getlevval(7), nullptr);
		e = getlevent();
		ASSERT_NE(e, nullptr);
		EXPECT_STREQ(e->name, "one") << "lookups share the walk's handle";
		EXPECT_EQ(p.log(), "getlevval_r #3 2\ngetlevval_r #3 7\ngetlevent_r #3 \n");
		EXPECT_EQ(p.live_handles(), 1);
		endlevent();
	});
}

TEST(StaticLayer, EachFunctionHasItsOwnResult)
{
	with_memtest([](const Plugin &p) {
		configure_default_entry(1);
		p.add_mac("alice", 1, 2, 3, 4, 500);
		macent_t *by_name = getmacnam("alice");
		ASSERT_NE(by_name, nullptr);
		macent_t *by_uid = getmacuid(0); // default entry for root
		ASSERT_NE(by_uid, nullptr);
		EXPECT_NE(by_name, by_uid);
		EXPECT_STREQ(by_name->name, "alice");
		EXPECT_EQ(by_name->cat2, 4u);
		EXPECT_STREQ(by_uid->name, "root");
		macent_t *walked = getmacent();
		ASSERT_NE(walked, nullptr);
		EXPECT_NE(walked, by_name);
		EXPECT_STREQ(by_name->name, "alice");
		EXPECT_EQ(getmacnam("alice"), by_name) << "the same function reuses its record";
		endmacent();
	});
}

TEST(StaticLayer, LongNamesAreCut)
{
	with_memtest([](const Plugin &p) {
		const std::string fits(1023, 'f'), cut(1024, 'c');
		p.add_cat(fits.c_str(), 1);
		p.add_cat(cut.c_str(), 2);
		catent_t *e = getcatval(1);
		ASSERT_NE(e, nullptr);
		EXPECT_EQ(std::string(e->name), fits);
		e = getcatval(2);
		ASSERT_NE(e, nullptr);
		EXPECT_EQ(std::string(e->name), cut.substr(0, 1023));
	});
}

TEST(StaticLayer, WriterResults)
{
	with_memtest([](const Plugin &p) {
		char n[] = "x";
		const levent_t lev{n, 1};
		const catent_t cat{n, 1};
		const macent_t mac{n, 0, 0, 0, 0};
		p.knob("put_result", 5);
		EXPECT_EQ(putlevent(&lev), 0) << "the level writer turns success into 0";
		EXPECT_EQ(putcatent(&cat), 5);
		EXPECT_EQ(putmacent(&mac), 5);
		p.knob("put_result", -2);
		EXPECT_EQ(putlevent(&lev), -1);
		EXPECT_EQ(putcatent(&cat), -2);

		p.add_lev("one", 1);
		EXPECT_EQ(rmlevval(0x101), 0);
		EXPECT_EQ(rmlevval(1), -1);
		p.add_cat("c", 8);
		EXPECT_EQ(rmcatval(8), 0);
		EXPECT_EQ(rmmacnam("x"), 0);
		EXPECT_EQ(p.live_handles(), 0);
	});
}

TEST(StaticLayer, StreamFunctionsNeedNoDatabase)
{
	in_fresh_process([] {
		FILE *fp = std::tmpfile();
		ASSERT_NE(fp, nullptr);
		char n[] = "bob";
		const macent_t m{n, 1, 0xa, 2, 0xb};
		EXPECT_EQ(fputmacent(fp, &m), 12);
		std::rewind(fp);
		macent_t *e = fgetmacent(fp);
		ASSERT_NE(e, nullptr);
		EXPECT_STREQ(e->name, "bob");
		EXPECT_EQ(e->cat2, 0xbu);
		EXPECT_EQ(fgetmacent(fp), nullptr);
		std::fclose(fp);
		EXPECT_EQ(g_init_calls, 0);
	});
}

// ---- wide-character layer ----

TEST(WideLayer, Release)
{
	errno = 0;
	EXPECT_EQ(wcfreecatent(nullptr), -1);
	EXPECT_EQ(errno, EINVAL);
	auto *e = static_cast<wclevent_t *>(std::calloc(1, sizeof(wclevent_t)));
	ASSERT_NE(e, nullptr);
	EXPECT_EQ(wcfreelevent(e), 0);
	auto *m = static_cast<wcmacent_t *>(std::calloc(1, sizeof(wcmacent_t)));
	ASSERT_NE(m, nullptr);
	m->name = static_cast<wchar_t *>(std::calloc(4, sizeof(wchar_t)));
	EXPECT_EQ(wcfreemacent(m), 0);
}

TEST(WideLayer, EntriesComeOutWide)
{
	with_memtest([](const Plugin &p) {
		p.add_mac("\xd0\xaf", 9, 0x99, 8, 0x88, 42); // "Я"
		p.add_lev("one", 1);
		void *mac = openmacdb_r();
		ASSERT_EQ(wcsetmacent(mac), 0);
		wcmacent_t *w = wcgetmacent(mac);
		ASSERT_NE(w, nullptr);
		EXPECT_STREQ(w->name, L"\u042f");
		EXPECT_EQ(w->lev1, 9);
		EXPECT_EQ(w->cat1, 0x99u);
		EXPECT_EQ(w->lev2, 8);
		EXPECT_EQ(w->cat2, 0x88u);
		EXPECT_EQ(wcfreemacent(w), 0);
		EXPECT_EQ(wcgetmacent(mac), nullptr);
		EXPECT_EQ(wcendmacent(mac), 0);
		w = wcgetmacuid(mac, 42);
		ASSERT_NE(w, nullptr);
		wcfreemacent(w);
		w = wcgetmacnam(mac, L"\u042f");
		ASSERT_NE(w, nullptr);
		EXPECT_EQ(w->cat2, 0x88u);
		wcfreemacent(w);
		closemacdb_r(mac);

		void *lev = openlevdb_r();
		p.clear_log();
		wclevent_t *l = wcgetlevval(lev, 0x101);
		ASSERT_NE(l, nullptr);
		EXPECT_STREQ(l->name, L"one");
		wcfreelevent(l);
		EXPECT_EQ(wcrmlevval(lev, 0x101), 0);
		EXPECT_EQ(p.log(), "getlevval_r #2 1\nrmlevval_r #2 1\n");
		closelevdb_r(lev);
	});
}

TEST(WideLayer, WalkEndLeavesHandleUsable)
{
	with_memtest([](const Plugin &p) {
		p.add_cat("c", 1);
		void *db = opencatdb_r();
		wccatent_t *c = wcgetcatent(db);
		ASSERT_NE(c, nullptr);
		wcfreecatent(c);
		EXPECT_EQ(wcgetcatent(db), nullptr);
		EXPECT_EQ(wcendcatent(db), 0);
		EXPECT_EQ(wcrmcatval(db, 1), 0);
		EXPECT_EQ(closecatdb_r(db), 0);
	});
}

TEST(WideLayer, NamesGoInNarrow)
{
	with_memtest([](const Plugin &p) {
		void *db = openlevdb_r();
		wchar_t name[] = L"\u042f";
		const wclevent_t w{name, 4};
		p.clear_log();
		EXPECT_EQ(wcputlevent(db, &w), 0);
		EXPECT_EQ(wcputlevent(db, nullptr), 0);
		EXPECT_EQ(wcrmlevnam(db, L"\u042f"), 0);
		EXPECT_EQ(wcgetlevnam(db, L"missing"), nullptr);
		EXPECT_EQ(p.log(), "putlevent_r #1 [\xd0\xaf]\nrmlevnam_r #1 [\xd0\xaf]\ngetlevnam_r #1 [missing]\n")
			<< "a NULL record reaches no plug-in";
		EXPECT_EQ(w.name, name);

		// A wide name without a multibyte form travels as NULL, which the
		// layer below refuses before the plug-in.
		const wchar_t bad[] = {static_cast<wchar_t>(0xd800), 0};
		p.clear_log();
		EXPECT_EQ(wcgetlevnam(db, bad), nullptr);
		EXPECT_EQ(wcrmlevnam(db, bad), -1);
		EXPECT_EQ(p.log(), "");
		closelevdb_r(db);
	});
}

TEST(WideLayer, StreamLinesMatchTheNarrowForm)
{
	in_fresh_process([] {
		use_utf8_locale();
		FILE *fp = std::tmpfile();
		ASSERT_NE(fp, nullptr);
		char n[] = "\xd0\xaf";
		const macent_t narrow{n, 1, 0xabc, 2, 0};
		wchar_t wn[] = L"\u042f";
		const wcmacent_t wide{wn, 1, 0xabc, 2, 0};
		ASSERT_GT(fputmacent_r(fp, &narrow), 0);
		ASSERT_GT(wcfputmacent(fp, &wide), 0);
		const std::string text = read_all(fp);
		EXPECT_EQ(text, "\xd0\xaf:1:abc:2:0\n\xd0\xaf:1:abc:2:0\n");
		std::rewind(fp);
		for (int i = 0; i < 2; ++i) {
			wcmacent_t *w = wcfgetmacent(fp);
			ASSERT_NE(w, nullptr);
			EXPECT_STREQ(w->name, L"\u042f");
			EXPECT_EQ(w->cat1, 0xabcu);
			wcfreemacent(w);
		}
		EXPECT_EQ(wcfgetmacent(fp), nullptr);
		std::fclose(fp);
	});
}

TEST(WideLayer, AllocationFailure)
{
	with_memtest([](const Plugin &p) {
		p.add_lev("level", 3);
		p.knob("quiet", 1);
		p.knob("no_store", 1);
		p.knob("put_result", 6);
		void *db = openlevdb_r();
		vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			wclevent_t *w = inj.run([&] { return wcgetlevnam(db, L"level"); });
			if (!w) {
				EXPECT_TRUE(inj.fired());
				return;
			}
			EXPECT_EQ(w->value, 3);
			if (w->name) {
				EXPECT_STREQ(w->name, L"level");
			} else {
				EXPECT_TRUE(inj.fired()) << "only a failed conversion leaves the name NULL";
			}
			wcfreelevent(w);
		});
		wchar_t name[] = L"level";
		const wclevent_t in{name, 3};
		vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			const int r = inj.run([&] { return wcputlevent(db, &in); });
			if (inj.fired()) {
				EXPECT_TRUE(r == 0 || r == 6) << r;
			} else {
				EXPECT_EQ(r, 6);
			}
		});
		closelevdb_r(db);
	});
}

} // namespace
