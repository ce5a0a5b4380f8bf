// The field writers and their *_get_text forms, table by table.
#include "repr/textout_fixture.hh"

#include <cstdint>
#include <cstring>
#include <optional>

namespace textout_test {
namespace {

constexpr int N = VYR_TEXT_NUMERIC;
constexpr int R = VYR_TEXT_NAMED_ONLY;
constexpr int Z = VYR_TEXT_OMIT_ZERO;

// What an obstack writer did: the text it left, or failure (-1) with the
// text it left before failing.
struct Written {
	int rc;
	std::string text;
};

template <class Writer>
Written write_with(Writer &&w)
{
	Obstack o;
	const int rc = w(o.get());
	return {rc, o.text()};
}

// Checks a writer's result against the expected text, or against failure
// when `expected` is empty, with `partial` the text left behind.
void expect_written(const Written &w, const std::optional<std::string> &expected,
                    const std::string &partial = "")
{
	if (expected) {
		EXPECT_EQ(w.rc, static_cast<int>(expected->size()));
		EXPECT_EQ(w.text, *expected);
	} else {
		EXPECT_EQ(w.rc, -1);
		EXPECT_EQ(w.text, partial);
	}
}

const std::nullopt_t fails = std::nullopt;

// ---- levels ----

struct LevelCase {
	uint8_t lev;
	int flags;
	std::optional<std::string> obstack; // nullopt: -1
	const char *get_text;               // "<null>": NULL
};

const LevelCase kLevelCases[] = {
	{5, 0, "secret", "secret"},
	{5, N, "5", "secret"},
	{5, R, "secret", "secret"},
	{5, Z, "secret", "secret"},
	{5, N | R, "5", "secret"},
	{2, 0, "2", "<null>"},
	{2, N, "2", "2"},
	{2, R, fails, "2"},
	{2, Z, "2", "2"},
	{2, N | R, "2", "2"},
	{0, 0, "public", "public"},
	{0, Z, "", ""},
	{0, Z | N, "", ""},
	{0, Z | R, "", ""},
	{255, 0, "top", "top"},
	{255, 0x100, "top", "top"}, // unknown flag bits are ignored...
	{2, 0x100, "2", "2"},       // ...except that get_text tests for exactly 0
};

void PrintTo(const LevelCase &c, std::ostream *os) { *os << "lev " << int(c.lev) << " flags " << c.flags; }

class LevelTable : public TextOut, public ::testing::WithParamInterface<LevelCase> {};

TEST_P(LevelTable, ObstackAndGetText)
{
	const LevelCase &c = GetParam();
	expect_written(write_with([&](obstack *o) { return vyr_lev_obstack(c.lev, o, c.flags); }), c.obstack);
	EXPECT_EQ(take(vyr_lev_get_text(c.lev, c.flags)), c.get_text);
}

INSTANTIATE_TEST_SUITE_P(TextOutLevels, LevelTable, ::testing::ValuesIn(kLevelCases));

TEST_F(TextOut, LevelWritersOpenTheDatabaseOnlyForNames)
{
	Obstack o;
	EXPECT_EQ(vyr_lev_obstack(5, o.get(), N), 1);
	EXPECT_EQ(vyr_lev_obstack(0, o.get(), Z), 0);
	EXPECT_EQ(take(vyr_lev_get_text(0, Z)), "");
	EXPECT_EQ(stats().lev_opens, 0);

	EXPECT_EQ(vyr_lev_obstack(2, o.get(), 0), 1);
	EXPECT_EQ(take(vyr_lev_get_text(2, 0)), "<null>");
	EXPECT_EQ(stats().lev_opens, 2);
	EXPECT_EQ(stats().lev_closes, 2);
}

TEST_F(TextOut, LevelWithoutDatabase)
{
	mem().set_open_ok(false, true);
	expect_written(write_with([](obstack *o) { return vyr_lev_obstack(5, o, 0); }), fails);
	expect_written(write_with([](obstack *o) { return vyr_lev_obstack(5, o, Z); }), fails);
	expect_written(write_with([](obstack *o) { return vyr_lev_obstack(5, o, N); }), "5");
	expect_written(write_with([](obstack *o) { return vyr_lev_obstack(0, o, Z); }), "");
	EXPECT_EQ(take(vyr_lev_get_text(5, 0)), "<null>");
	EXPECT_EQ(take(vyr_lev_get_text(5, N)), "<null>");
	EXPECT_EQ(take(vyr_lev_get_text(0, Z)), "");
}

// ---- integrity levels ----

struct IlevCase {
	uint8_t ilev;
	int flags;
	std::optional<std::string> obstack;
	const char *get_text;
};

const IlevCase kIlevCases[] = {
	{0, 0, "Low", "Low"},
	{0, N, "0", "Low"},
	{0, R, "Low", "Low"},
	{1, 0, "High", "High"},
	{1, N, "1", "High"},
	{1, Z, "High", "High"},
	{2, 0, "2", "2"},
	{2, N, "2", "2"},
	{2, R, fails, "<null>"},
	{2, N | R, "2", "<null>"},
	{255, Z, "255", "255"},
};

void PrintTo(const IlevCase &c, std::ostream *os) { *os << "ilev " << int(c.ilev) << " flags " << c.flags; }

class IlevTable : public TextOut, public ::testing::WithParamInterface<IlevCase> {};

TEST_P(IlevTable, ObstackAndGetText)
{
	const IlevCase &c = GetParam();
	expect_written(write_with([&](obstack *o) { return vyr_ilev_obstack(c.ilev, o, c.flags); }), c.obstack);
	EXPECT_EQ(take(vyr_ilev_get_text(c.ilev, c.flags)), c.get_text);
	EXPECT_EQ(stats().lev_opens, 0);
}

INSTANTIATE_TEST_SUITE_P(TextOutIlevs, IlevTable, ::testing::ValuesIn(kIlevCases));

// ---- categories ----

struct CatCase {
	uint64_t cat;
	int flags;
	std::optional<std::string> text;
	std::string partial; // left behind on failure
};

const CatCase kCatCases[] = {
	{0x1, 0, "alpha", ""},
	{0x3, 0, "alpha,beta", ""},
	// pair (0x6) lost bit 0x2 to beta, which comes first: not written
	{0x6, 0, "beta,0x4", ""},
	{0x4, 0, "0x4", ""},
	// a several-bit entry that comes first wins over a later single bit
	{0x30, 0, "wide", ""},
	{0x20, 0, "eps", ""},
	{0x9, 0, "alpha,0x8", ""},
	{0xffffffffffffffffull, 0, "alpha,beta,wide,0xffffffffffffffcc", ""},
	{0x8000000000000000ull, Z, "0x8000000000000000", ""},
	{0x0, 0, "0x0", ""},
	{0x3, R, "alpha,beta", ""},
	{0x9, R, fails, "alpha"},
	{0x8, R, fails, ""},
	{0x0, R, fails, ""},
	{0x3, N, "0x3", ""},
	{0x0, N, "0x0", ""},
	{0x9, N | R, "0x9", ""},
};

void PrintTo(const CatCase &c, std::ostream *os) { *os << "cat 0x" << std::hex << c.cat << std::dec << " flags " << c.flags; }

class CatTable : public TextOut, public ::testing::WithParamInterface<CatCase> {};

TEST_P(CatTable, ObstackAndGetText)
{
	const CatCase &c = GetParam();
	expect_written(write_with([&](obstack *o) { return vyr_cat_obstack(c.cat, o, c.flags); }), c.text,
	               c.partial);
	EXPECT_EQ(take(vyr_cat_get_text(c.cat, c.flags)), c.text.value_or("<null>"));
	// Whatever happened, every open was matched by a close.
	EXPECT_EQ(stats().cat_opens, stats().cat_closes);
	EXPECT_EQ(stats().cat_opens, (c.flags & N) ? 0 : 2);
}

INSTANTIATE_TEST_SUITE_P(TextOutCats, CatTable, ::testing::ValuesIn(kCatCases));

TEST_F(TextOut, CategoryZeroIsLookedUpAsAValue)
{
	mem().reset();
	mem().add_category("nothing", 0x0);
	mem().add_category("alpha", 0x1);
	expect_written(write_with([](obstack *o) { return vyr_cat_obstack(0, o, 0); }), "nothing");
	expect_written(write_with([](obstack *o) { return vyr_cat_obstack(0, o, R); }), "nothing");
	expect_written(write_with([](obstack *o) { return vyr_cat_obstack(0, o, N); }), "0x0");
	// In a walk, an entry of value 0 claims nothing and is never written.
	expect_written(write_with([](obstack *o) { return vyr_cat_obstack(0x1, o, 0); }), "alpha");
	EXPECT_EQ(stats().cat_lookups, 2);
	EXPECT_EQ(stats().cat_sets, 1);
}

TEST_F(TextOut, CategoryWalkIsOnePassThatStopsWhenAllBitsAreNamed)
{
	expect_written(write_with([](obstack *o) { return vyr_cat_obstack(0x3, o, 0); }), "alpha,beta");
	textoutmem_stats s = stats();
	EXPECT_EQ(s.cat_opens, 1);
	EXPECT_EQ(s.cat_sets, 1);
	EXPECT_EQ(s.cat_nexts, 2); // stopped right after beta
	EXPECT_EQ(s.cat_ends, 1);
	EXPECT_EQ(s.cat_closes, 1);
	EXPECT_EQ(s.cat_lookups, 0);

	mem().clear_stats();
	expect_written(write_with([](obstack *o) { return vyr_cat_obstack(0x9, o, 0); }), "alpha,0x8");
	s = stats();
	EXPECT_EQ(s.cat_opens, 1);
	EXPECT_EQ(s.cat_nexts, 6); // five entries and the end
	EXPECT_EQ(s.cat_ends, 1);
	EXPECT_EQ(s.cat_closes, 1);
}

TEST_F(TextOut, CategoryWalkThatCannotStart)
{
	mem().set_catset_result(-1);
	expect_written(write_with([](obstack *o) { return vyr_cat_obstack(0x3, o, 0); }), fails);
	EXPECT_EQ(stats().cat_closes, 1);
	EXPECT_EQ(stats().cat_nexts, 0);
	// mask 0 needs no walk
	expect_written(write_with([](obstack *o) { return vyr_cat_obstack(0, o, 0); }), "0x0");
}

TEST_F(TextOut, CategoryWithoutDatabaseFallsBackToTheMask)
{
	mem().set_open_ok(true, false);
	expect_written(write_with([](obstack *o) { return vyr_cat_obstack(0x9, o, 0); }), "0x9");
	expect_written(write_with([](obstack *o) { return vyr_cat_obstack(0x9, o, R); }), fails);
	expect_written(write_with([](obstack *o) { return vyr_cat_obstack(0x9, o, N); }), "0x9");
	EXPECT_EQ(take(vyr_cat_get_text(0x1, 0)), "0x1");
}

// ---- type ----

struct TypeCase {
	uint16_t type;
	int flags;
	const char *text;
};

const TypeCase kTypeCases[] = {
	{3, 0, "CCNRA"},
	{7, 0, "ALL"},
	{1, 0, "ccnr"},
	{2, 0, "ccnri"},
	{4, 0, "ehole"},
	{5, 0, "ccnr,ehole"},
	{6, 0, "ccnri,ehole"},
	{0, 0, "0x0"},
	{9, 0, "ccnr,0x8"},
	{16, 0, "0x10"},
	{0xb, 0, "ccnr,ccnri,0x8"}, // 3 plus another bit is no composite
	{0xffff, 0, "ccnr,ccnri,ehole,0xfff8"},
	{3, N, "0x3"},
	{0, N, "0x0"},
	{0xffff, N, "0xffff"},
	{3, R | Z, "CCNRA"},
	{16, R, "0x10"},
};

void PrintTo(const TypeCase &c, std::ostream *os) { *os << "type " << c.type << " flags " << c.flags; }

class TypeTable : public TextOut, public ::testing::WithParamInterface<TypeCase> {};

TEST_P(TypeTable, ObstackAndGetText)
{
	const TypeCase &c = GetParam();
	expect_written(write_with([&](obstack *o) { return vyr_type_obstack(c.type, o, c.flags); }),
	               std::string(c.text));
	EXPECT_EQ(take(vyr_type_get_text(c.type, c.flags)), c.text);
}

INSTANTIATE_TEST_SUITE_P(TextOutTypes, TypeTable, ::testing::ValuesIn(kTypeCases));

// ---- roles ----

struct RoleCase {
	bool first, second; // lists 2,1 and 3 present
	int flags;
	const char *text;
};

const RoleCase kRoleCases[] = {
	{false, false, 0, "No:No"},   {false, false, N, ":"},  {false, false, Z, ""},
	{true, false, 0, "2,1:No"},   {true, false, N, "2,1:"}, {true, false, Z, "2,1"},
	{false, true, 0, "No:3"},     {false, true, N, ":3"},  {false, true, Z, ":3"},
	{true, true, 0, "2,1:3"},     {true, true, N, "2,1:3"}, {true, true, Z, "2,1:3"},
	{false, false, N | Z, ":"},   {true, false, N | Z, "2,1:"},
	{false, false, R, "No:No"},
};

void PrintTo(const RoleCase &c, std::ostream *os) { *os << "lists " << c.first << c.second << " flags " << c.flags; }

class RoleTable : public TextOut, public ::testing::WithParamInterface<RoleCase> {};

TEST_P(RoleTable, ObstackAndGetText)
{
	const RoleCase &c = GetParam();
	StackLabel lab(0, 0, 0, 0, {}, {});
	if (c.first)
		lab.r1 = {{2, 0, 0}, {1, 0, 0}};
	if (c.second)
		lab.r2 = {{3, 0, 0}};
	lab.rl.nroles1 = static_cast<uint32_t>(lab.r1.size());
	lab.rl.roles1 = lab.r1.empty() ? nullptr : lab.r1.data();
	lab.rl.nroles2 = static_cast<uint32_t>(lab.r2.size());
	lab.rl.roles2 = lab.r2.empty() ? nullptr : lab.r2.data();
	expect_written(write_with([&](obstack *o) { return vyrrl_obstack(&lab.rl, o, c.flags); }),
	               std::string(c.text));
	EXPECT_EQ(take(vyrrl_get_text(&lab.rl, c.flags)), c.text);
}

INSTANTIATE_TEST_SUITE_P(TextOutRoles, RoleTable, ::testing::ValuesIn(kRoleCases));

TEST_F(TextOut, RoleIdsAreSignedDecimal)
{
	StackLabel lab(0, 0, 0, 0, {UINT64_MAX, 0x8000000000000000ull, 12}, {0x7fffffffffffffffull});
	EXPECT_EQ(take(vyrrl_get_text(&lab.rl, 0)), "-1,-9223372036854775808,12:9223372036854775807");
}

// ---- whole labels ----

struct LabelCase {
	uint8_t lev, ilev;
	uint64_t cat;
	uint16_t type;
	bool roles;
	int flags;
	const char *text; // "<null>": failure
};

const LabelCase kLabelCases[] = {
	{2, 1, 0, 0, false, 0, "2:High:0x0:0x0!No:No"},
	{2, 1, 0, 0, false, N, "2:1:0x0:0x0!:"},
	{0, 0, 0, 3, false, Z, ":Low:0x0:CCNRA!"},
	{5, 0, 0x3, 5, true, 0, "secret:Low:alpha,beta:ccnr,ehole!2,1:3"},
	{5, 0, 0x3, 5, true, N, "5:0:0x3:0x5!2,1:3"},
	{0, 1, 0x9, 7, true, Z, ":High:alpha,0x8:ALL!2,1:3"},
	{0, 1, 0x9, 7, false, Z | N, ":1:0x9:0x7!:"},
	{5, 1, 0x3, 3, false, R, "secret:High:alpha,beta:CCNRA!No:No"},
	{2, 1, 0x3, 3, false, R, "<null>"},
	{5, 2, 0x3, 3, false, R, "<null>"},
	{5, 1, 0x8, 3, false, R, "<null>"},
};

void PrintTo(const LabelCase &c, std::ostream *os) { *os << c.text << " flags " << c.flags; }

class LabelTable : public TextOut, public ::testing::WithParamInterface<LabelCase> {};

TEST_P(LabelTable, AllForms)
{
	const LabelCase &c = GetParam();
	StackLabel lab(c.lev, c.ilev, c.cat, c.type);
	if (c.roles) {
		lab.r1 = {{2, 0, 0}, {1, 0, 0}};
		lab.r2 = {{3, 0, 0}};
		lab.rl = vyrrl_t{2, 1, lab.r1.data(), lab.r2.data(), 1};
	}
	const std::string expected = c.text;
	EXPECT_EQ(take(vyrl_get_text(&lab.l, c.flags)), expected);
	EXPECT_EQ(take(vyrl_asprintf(&lab.l, "%F%Gm!%Gr", c.flags)), expected);
	Written w = write_with([&](obstack *o) { return vyrl_obstack(&lab.l, o, c.flags); });
	if (expected != "<null>") {
		EXPECT_EQ(w.rc, static_cast<int>(expected.size()));
		EXPECT_EQ(w.text, expected);
		// the mandatory and role texts are the two halves
		const size_t bang = expected.find('!');
		EXPECT_EQ(take(vyrml_get_text(&lab.ml, c.flags)), expected.substr(0, bang));
		EXPECT_EQ(take(vyrrl_get_text(&lab.rl, c.flags)), expected.substr(bang + 1));
	} else {
		EXPECT_EQ(w.rc, -1);
		EXPECT_EQ(take(vyrml_get_text(&lab.ml, c.flags)), "<null>");
	}
}

INSTANTIATE_TEST_SUITE_P(TextOutLabels, LabelTable, ::testing::ValuesIn(kLabelCases));

TEST_F(TextOut, FailureLeavesEarlierFieldsOnTheCallersObstack)
{
	StackLabel lab(5, 1, 0x9, 3);
	Obstack o;
	EXPECT_EQ(vyrml_obstack(&lab.ml, o.get(), R), -1);
	EXPECT_EQ(o.text(), "secret:High:alpha");
}

// ---- translated words ----

TEST_F(TextOut, FixedWordsAreTranslatedAtEachUse)
{
	StackLabel lab(2, 1, 0, 0);
	const long before = translation_lookups();
	EXPECT_EQ(take(vyrl_get_text(&lab.l, 0)), "2:High:0x0:0x0!No:No");
	EXPECT_EQ(translation_lookups() - before, 3);
	{
		ScopedTranslation fr(kFrench);
		EXPECT_EQ(take(vyrl_get_text(&lab.l, 0)), "2:Haut:0x0:0x0!Aucun|aucun");
		EXPECT_EQ(take(vyr_ilev_get_text(0, 0)), "Bas");
		EXPECT_EQ(take(vyr_ilev_get_text(1, N)), "Haut");
		// numbers and type names are never translated
		EXPECT_EQ(take(vyrl_get_text(&lab.l, N)), "2:1:0x0:0x0!:");
		EXPECT_EQ(take(vyr_type_get_text(3, 0)), "CCNRA");
	}
	// nothing was kept from the translation
	EXPECT_EQ(take(vyrl_get_text(&lab.l, 0)), "2:High:0x0:0x0!No:No");
	EXPECT_EQ(translation_lookups() - before, 11);
	EXPECT_FALSE(foreign_lookup_seen());
}

TEST_F(TextOut, TranslationsAreWrittenAsTheyStand)
{
	static constexpr Words kOdd = {"%s%%", "H!gh:1", "", ":"};
	ScopedTranslation odd(kOdd);
	StackLabel lab(5, 0, 0, 0);
	EXPECT_EQ(take(vyrl_get_text(&lab.l, 0)), "secret:%s%%:0x0:0x0!:");
	lab.ml.ilev = 1;
	EXPECT_EQ(take(vyrml_get_text(&lab.ml, 0)), "secret:H!gh:1:0x0:0x0");
}

// ---- vyr_obstack_finish ----

TEST_F(TextOut, FinishCopiesTheObjectAndReleasesTheObstack)
{
	struct obstack o;
	_obstack_begin(&o, 0, 0, [](long n) { return std::malloc(static_cast<size_t>(n)); }, std::free);
	EXPECT_EQ(take(vyr_obstack_finish(&o)), ""); // an empty object is an empty string

	_obstack_begin(&o, 0, 0, [](long n) { return std::malloc(static_cast<size_t>(n)); }, std::free);
	std::string big(10000, 'x'); // spans several chunks
	obstack_grow(&o, big.data(), big.size());
	obstack_grow(&o, "tail", 4);
	EXPECT_EQ(take(vyr_obstack_finish(&o)), big + "tail");
	// o is released; under the sanitizers a second release or a leak shows
}

} // namespace
} // namespace textout_test
