// Allocation failure in every function of the text family that allocates:
// each allocation of a call fails once in turn. The call reports the failure
// or absorbs it as its rules say, and leaves nothing allocated behind.
#include "support/memdb/textmem.h"
#include "repr/text_support.hh"

#include "support/failalloc.h"
#include "support/obstack_guard.hh"

#include <functional>
#include <map>

namespace text_test {
namespace {

using TextAlloc = TextTest;
using vyr_test::Injector;

// Sweeps attempt(inj), which runs its call under inj and describes the
// result. The run without a failure must give `expected`; returns how often
// each other result came of a failed allocation. Descriptions are built
// outside inj.run(), where nothing fails.
using Attempt = std::function<std::string(Injector &)>;
std::map<std::string, int> sweep(const Attempt &attempt, const std::string &expected)
{
	std::map<std::string, int> seen;
	const long attempts = vyr_test::sweep_alloc_failures([&](Injector &inj) {
		const std::string got = attempt(inj);
		if (inj.fired())
			++seen[got];
		else
			EXPECT_EQ(got, expected);
	});
	EXPECT_GT(attempts, 1) << "the call allocated nothing";
	return seen;
}

// A text builder's result: the string, "<null>", or "<aborted>".
Attempt text_of(std::function<char *()> call)
{
	return [call](Injector &inj) {
		bool aborted = false;
		char *s = inj.run([&] { return vyr_test::obstack_guarded(call, &aborted); });
		return aborted ? std::string("<aborted>") : take(s);
	};
}

// A builder that begins its own obstack: its first chunk is the one failure
// that reaches the handler, the final copy one that gives NULL, and a failed
// lookup may write a number in place of a name.
TEST_F(TextAlloc, TextBuilders)
{
	StackLabel lab(5, 1, 0x9, 5, {2, 1}, {3});
	const std::pair<std::function<char *()>, const char *> calls[] = {
		{[&] { return vyrl_get_text(&lab.l, 0); }, "secret:High:alpha,0x8:ccnr,ehole!2,1:3"},
		{[&] { return vyrml_get_text(&lab.ml, 0); }, "secret:High:alpha,0x8:ccnr,ehole"},
		{[&] { return vyrrl_get_text(&lab.rl, 0); }, "2,1:3"},
		{[&] { return vyrml_asprintf(&lab.ml, "<%l>"); }, "<secret>"},
		{[&] { return vyrl_asprintf(&lab.l, "%F%Gc", 0); }, "alpha,0x8"},
		{[&] { return vyr_cat_get_text(0x9, 0); }, "alpha,0x8"},
		{[&] { return vyr_type_get_text(9, 0); }, "ccnr,0x8"},
	};
	for (const auto &[call, expected] : calls) {
		SCOPED_TRACE(expected);
		auto seen = sweep(text_of(call), expected);
		EXPECT_EQ(seen["<aborted>"], 1);
		EXPECT_GE(seen["<null>"], 1);
	}
	EXPECT_EQ(textmem_get_stats().lev_opens, textmem_get_stats().lev_closes);
	EXPECT_EQ(textmem_get_stats().cat_opens, textmem_get_stats().cat_closes);
}

// The forms without an obstack, and vyr_obstack_finish: the copy that
// becomes the result fails.
TEST_F(TextAlloc, CopiedTexts)
{
	const std::pair<std::function<char *()>, const char *> calls[] = {
		{[] { return vyr_lev_get_text(5, 0); }, "secret"},
		{[] { return vyr_lev_get_text(0, VYR_TEXT_OMIT_ZERO); }, ""},
		{[] { return vyr_ilev_get_text(1, 0); }, "High"},
		{[] { return vyr_ilev_get_text(200, 0); }, "200"},
	};
	for (const auto &[call, expected] : calls) {
		SCOPED_TRACE(expected);
		EXPECT_GE(sweep(text_of(call), expected)["<null>"], 1);
	}
	auto seen = sweep([](Injector &inj) {
		struct obstack o;
		_obstack_begin(&o, 0, 0, [](long n) { return std::malloc(static_cast<size_t>(n)); }, std::free);
		obstack_grow(&o, "text", 4);
		return take(inj.run([&] { return vyr_obstack_finish(&o); }));
	}, "text");
	EXPECT_EQ(seen, (std::map<std::string, int>{{"<null>", 1}}));
}

// On the caller's obstack only the database work allocates; a level
// database that can't be opened is a failure of the level field.
TEST_F(TextAlloc, WritersOnTheCallersObstack)
{
	StackLabel lab(5, 1, 0x9, 5);
	auto seen = sweep([&](Injector &inj) {
		Obstack o;
		const int rc = inj.run([&] { return vyrml_obstack(&lab.ml, o.get(), 0); });
		return rc < 0 ? std::string("-1") : o.text();
	}, "secret:High:alpha,0x8:ccnr,ehole");
	EXPECT_GE(seen["-1"], 1);
}

// A record reader gives the whole record or NULL, in either form; a
// database that can't be opened still leaves the numbers. The texts hold no
// name that also spells a number, which would read differently without its
// database.
TEST_F(TextAlloc, RecordReaders)
{
	for (const char *text : {"secret:High:alpha,beta:ehole!5,3,5:1", "5:1:0x3:0x5!No:2", "1!", "!"}) {
		SCOPED_TRACE(text);
		vyrl_t *want = vyrl_get_from_text(text);
		ASSERT_NE(want, nullptr);
		const std::string ml_text(text, std::strchr(text, '!'));
		const char *rl_text = std::strchr(text, '!') + 1;
		const auto check = [](auto read, const char *t, auto same, auto put) {
			auto seen = sweep([&](Injector &inj) {
				std::vector<char> b = buffer(t);
				auto *got = inj.run([&] { return read(b.data()); });
				const std::string r = got == nullptr ? "<null>" : same(got) ? "same" : "different";
				if (got != nullptr)
					put(got);
				return r;
			}, "same");
			EXPECT_EQ(seen.count("different"), 0u) << "a failure absorbed must leave the record whole";
			EXPECT_GE(seen["<null>"], 1);
		};
		const auto same_l = [&](const vyrl_t *g) { return vyrl_cmp(g, want, 0) == 1; };
		check(vyrl_get_from_text, text, same_l, vyrl_put);
		check(vyrl_get_from_text_nc, text, same_l, vyrl_put);
		check(vyrml_get_from_text, ml_text.c_str(), [&](const vyrml_t *g) { return vyrml_cmp(g, want->ml) == 1; }, vyrml_put);
		check(vyrrl_get_from_text_nc, rl_text, [&](const vyrrl_t *g) { return vyrrl_cmp(g, want->rl, 0) == 1; }, vyrrl_put);
		vyrl_put(want);
	}
}

// Whether strdup reaches the failing allocator: the sanitizer runtimes serve
// it themselves, and the readers take their private copies with it.
bool strdup_can_fail()
{
	vyr_test::FailAlloc::arm(1);
	char *copy = strdup("x");
	vyr_test::FailAlloc::disarm();
	const bool failed = copy == nullptr;
	std::free(copy);
	return failed;
}

// The list and field readers fail with -1 and leave their out values alone.
TEST_F(TextAlloc, ListAndFieldReaders)
{
	auto seen = sweep([](Injector &inj) {
		std::vector<char> b = buffer("3,1,2,3");
		vyr_role_t *const sentinel = reinterpret_cast<vyr_role_t *>(&b);
		vyr_role_t *list = sentinel;
		uint32_t count = 77;
		if (inj.run([&] { return vyr_roles_from_text(b.data(), &list, &count); }) != 0)
			return std::string(count == 77 && list == sentinel ? "-1" : "-1, list written");
		const std::string r = std::to_string(count) + ":" + std::to_string(list[0].id) + std::to_string(list[2].id);
		std::free(list);
		return r;
	}, "3:31");
	EXPECT_EQ(seen, (std::map<std::string, int>{{"-1", 1}}));

	// The copy fails with the mask untouched; a failed lookup leaves "alpha"
	// to be read as a number, which fails with the mask cleared.
	seen = sweep([](Injector &inj) {
		uint64_t cat = 0x5555;
		const int rc = inj.run([&] { return vyr_cat_from_text("alpha,beta", &cat); });
		return std::to_string(rc) + ":" + std::to_string(cat);
	}, "0:3");
	EXPECT_GE(seen["-1:0"], 1);
	EXPECT_EQ(seen["-1:21845"], strdup_can_fail() ? 1 : 0);
	if (!strdup_can_fail())
		return;
	seen = sweep([](Injector &inj) {
		uint16_t type = 0x5a5a;
		const int rc = inj.run([&] { return vyr_type_from_text("ccnr,ehole", &type); });
		return std::to_string(rc) + ":" + std::to_string(type);
	}, "0:5");
	EXPECT_EQ(seen, (std::map<std::string, int>{{"-1:23130", 1}}));
}

} // namespace
} // namespace text_test
