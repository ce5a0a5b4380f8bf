// Allocation failure in every text builder: the call fails or falls back as
// its rules say, and nothing it allocated stays behind.
#include "repr/textout_fixture.hh"

#include "support/failalloc.h"

#include <cstdlib>
#include <functional>

namespace textout_test {
namespace {

// Sweeps every allocation of call() and checks the text of the one run in
// which nothing failed.  A failed lookup is no error for the writers (the
// value is then written as a number), so a run with a failure may still give
// text; a failed obstack chunk ends in the obstack failure handler.
void sweep_text(const std::function<char *()> &call, const std::string &expected)
{
	long nulls = 0, aborted_runs = 0;
	const long attempts = vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		bool aborted = false;
		char *s = inj.run([&] { return guarded(call, &aborted); });
		if (!inj.fired()) {
			EXPECT_FALSE(aborted);
			EXPECT_EQ(take(s), expected);
			return;
		}
		nulls += s == nullptr && !aborted;
		aborted_runs += aborted;
		std::free(s);
	});
	EXPECT_GT(attempts, 1) << "the call allocated nothing";
	EXPECT_EQ(aborted_runs, 1) << "only the obstack's first chunk should reach the handler";
	::testing::Test::RecordProperty("null_results", static_cast<int>(nulls));
}

class TextOutAlloc : public TextOut {};

TEST_F(TextOutAlloc, WholeLabelWithNames)
{
	StackLabel lab(5, 1, 0x9, 5, {2, 1}, {3});
	sweep_text([&] { return vyrl_get_text(&lab.l, 0); }, "secret:High:alpha,0x8:ccnr,ehole!2,1:3");
	EXPECT_EQ(stats().lev_opens, stats().lev_closes);
	EXPECT_EQ(stats().cat_opens, stats().cat_closes);
}

TEST_F(TextOutAlloc, WholeLabelNumeric)
{
	StackLabel lab(5, 1, 0x9, 5, {2, 1}, {3});
	sweep_text([&] { return vyrl_get_text(&lab.l, VYR_TEXT_NUMERIC); }, "5:1:0x9:0x5!2,1:3");
}

TEST_F(TextOutAlloc, PartsAndFormats)
{
	StackLabel lab(5, 1, 0x3, 3, {9}, {});
	sweep_text([&] { return vyrml_get_text(&lab.ml, 0); }, "secret:High:alpha,beta:CCNRA");
	sweep_text([&] { return vyrrl_get_text(&lab.rl, 0); }, "9:No");
	sweep_text([&] { return vyrml_asprintf(&lab.ml, "<%l>"); }, "<secret>");
	sweep_text([&] { return vyrrl_asprintf(&lab.rl, "<%Nr>"); }, "<9:>");
	sweep_text([&] { return vyrl_asprintf(&lab.l, "%F%Gc", 0); }, "alpha,beta");
	sweep_text([&] { return vyr_cat_get_text(0x9, 0); }, "alpha,0x8");
	sweep_text([&] { return vyr_type_get_text(9, 0); }, "ccnr,0x8");
}

// The two forms without an obstack.
TEST_F(TextOutAlloc, LevelAndIntegrityLevelText)
{
	struct Case {
		std::function<char *()> call;
		const char *expected;
	} cases[] = {
		{[] { return vyr_lev_get_text(5, 0); }, "secret"},
		{[] { return vyr_lev_get_text(2, VYR_TEXT_NUMERIC); }, "2"},
		{[] { return vyr_lev_get_text(0, VYR_TEXT_OMIT_ZERO); }, ""},
		{[] { return vyr_ilev_get_text(1, 0); }, "High"},
		{[] { return vyr_ilev_get_text(200, 0); }, "200"},
	};
	for (const Case &c : cases) {
		SCOPED_TRACE(c.expected);
		long nulls = 0;
		const long attempts = vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			char *s = inj.run(c.call);
			if (!inj.fired()) {
				EXPECT_EQ(take(s), c.expected);
				return;
			}
			nulls += s == nullptr;
			std::free(s);
		});
		EXPECT_GT(attempts, 1);
		// The copy that becomes the result is the last allocation: its
		// failure must give NULL.
		EXPECT_GE(nulls, 1);
	}
}

// Writers on the caller's obstack: its chunk is there already, so only the
// database work allocates.
TEST_F(TextOutAlloc, WritersOnTheCallersObstack)
{
	StackLabel lab(5, 1, 0x9, 5);
	long failures = 0;
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		Obstack o;
		const int rc = inj.run([&] { return vyrml_obstack(&lab.ml, o.get(), 0); });
		if (!inj.fired()) {
			EXPECT_EQ(o.text(), "secret:High:alpha,0x8:ccnr,ehole");
			EXPECT_EQ(rc, static_cast<int>(o.text().size()));
			return;
		}
		failures += rc < 0;
	});
	// A handle that can't be allocated makes the level database unavailable,
	// and that is a failure for the level field.
	EXPECT_GE(failures, 1);
	EXPECT_EQ(stats().lev_opens, stats().lev_closes);
	EXPECT_EQ(stats().cat_opens, stats().cat_closes);
}

TEST_F(TextOutAlloc, FinishFailsCleanly)
{
	long nulls = 0;
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		struct obstack o;
		_obstack_begin(&o, 0, 0, [](long n) { return std::malloc(static_cast<size_t>(n)); }, std::free);
		obstack_grow(&o, "text", 4);
		char *s = inj.run([&] { return vyr_obstack_finish(&o); });
		if (!inj.fired()) {
			EXPECT_EQ(take(s), "text");
			return;
		}
		EXPECT_EQ(s, nullptr);
		++nulls;
	});
	EXPECT_EQ(nulls, 1);
}

} // namespace
} // namespace textout_test
