// The label text writers and the format engine, table by table, against the
// in-memory back-end, which also counts the database work they do.
#include "support/memdb/textmem.h"
#include "repr/text_support.hh"


namespace text_test {
namespace {

constexpr int N = VYR_TEXT_NUMERIC;
constexpr int R = VYR_TEXT_NAMED_ONLY;
constexpr int Z = VYR_TEXT_OMIT_ZERO;

using TextOut = TextTest;

textmem_stats stats() { return textmem_get_stats(); }

// A writer's result on a fresh obstack: the text on success, else "-1:"
// and the text it left behind before failing.
template <class Writer>
std::string written(Writer &&w)
{
	Obstack o;
	const int rc = w(o.get());
	std::string text = o.text();
	if (rc < 0)
		return "-1:" + text;
	EXPECT_EQ(rc, static_cast<int>(text.size())) << "count of \"" << text << '"';
	return text;
}

// Label: lev 5 (secret), ilev 1, cat 0x3 (alpha,beta), type 3, roles 2,1:3.
TEST_F(TextOut, EngineDirectives)
{
	const struct {
		const char *format;
		int arg;  // for F directives; the engine reads no other argument
		const char *text;
	} rows[] = {
		{"", 0, ""},
		{"\xc3\xa9t\xc3\xa9 %t", 0, "\xc3\xa9t\xc3\xa9 CCNRA"},  // bytes above 127 as they are
		{"100%%", 0, "100%"},
		{"end%", 0, "end"},
		{"%-007l|%12t|%-3i", 0, "secret|CCNRA|High"},  // width and justification ignored
		{"[%x%Q]", 0, "[]"},                           // unknown letters swallowed
		{"%-%", 0, ""},
		{"%NF%F%Gi", 1, "1"},  // F behind a flag is an unknown letter, reads no argument
		{"%NNl", 0, "l"},      // a second N right behind an N ends the directive
		{"%NRNl", 0, "5"},
		{"%Gl", 0, "secret"},  // G without F brings in 0
		{"%Gl%F%Gl", 1, "secret5"},
		{"%-03F%Gl", 1, "5"},
		{"%F%Nl %l", 1, "5 secret"},  // the stored word counts only behind G
		{"%F%GZl", 1, "5"},
		{"%l|%i|%c|%t|%r", 0, "secret|High|alpha,beta|CCNRA|2,1:3"},
		{"%Nl|%Ni|%Nc|%Nt|%Nr", 0, "5|1|0x3|0x3|2,1:3"},
		{"%m", 0, "secret:High:alpha,beta:CCNRA"},
		{"%F%Gm!%Gr", 1, "5:1:0x3:0x3!2,1:3"},
		{"a%-", 0, "a"},  // a format that ends inside a directive ends there
		{"a%007", 0, "a"},
		{"a%GZR", 0, "a"},
	};
	StackLabel lab(5, 1, 0x3, 3, {2, 1}, {3});
	for (const auto &r : rows) {
		SCOPED_TRACE(r.format);
		Obstack o;
		obstack_grow(o.get(), "<", 1);  // text already on the caller's obstack stays
		EXPECT_EQ(vyrl_obstack_printf(&lab.l, o.get(), r.format, r.arg), static_cast<int>(std::strlen(r.text)));
		EXPECT_EQ(o.text(), std::string("<") + r.text);
		EXPECT_EQ(take(vyrl_asprintf(&lab.l, r.format, r.arg)), r.text);
	}
}

// The part forms hand the engine their part and NULL for the other.
TEST_F(TextOut, PartForms)
{
	StackLabel lab(5, 0, 0x1, 1, {7}, {});
	Obstack a, b;
	EXPECT_EQ(vyrml_obstack_printf(&lab.ml, a.get(), "%l/%m"), 28);
	EXPECT_EQ(a.text(), "secret/secret:Low:alpha:ccnr");
	EXPECT_EQ(vyrrl_obstack_printf(&lab.rl, b.get(), "(%r)(%Nr)(%Zr)"), 13);
	EXPECT_EQ(b.text(), "(7:No)(7:)(7)");
	EXPECT_EQ(take(vyrml_asprintf(&lab.ml, "%F%Gl", N)), "5");
	EXPECT_EQ(take(vyrrl_asprintf(&lab.rl, "<%r>")), "<7:No>");
}

TEST_F(TextOut, FailedConversionStopsTheEngine)
{
	StackLabel lab(2, 0, 0x8, 0);  // level 2 and bit 0x8 have no names
	EXPECT_EQ(written([&](obstack *o) { return vyrml_obstack_printf(&lab.ml, o, "x%Rl y%l"); }), "-1:x");
	EXPECT_EQ(written([&](obstack *o) { return vyrml_obstack_printf(&lab.ml, o, "%l:%Rc:%t"); }), "-1:2:");
	EXPECT_EQ(take(vyrml_asprintf(&lab.ml, "%F%Gm", R)), "<null>");
	EXPECT_EQ(take(vyrml_asprintf(&lab.ml, "%Gm", R)), "2:Low:0x8:0x0");
}

// The four field writers, each with its obstack form and its get_text form.
enum Field { lev, ilev, cat, type };

std::string field_obstack(Field f, uint64_t v, int flags)
{
	return written([&](obstack *o) {
		switch (f) {
		case lev: return vyr_lev_obstack(static_cast<uint8_t>(v), o, flags);
		case ilev: return vyr_ilev_obstack(static_cast<uint8_t>(v), o, flags);
		case cat: return vyr_cat_obstack(v, o, flags);
		default: return vyr_type_obstack(static_cast<uint16_t>(v), o, flags);
		}
	});
}

std::string field_get_text(Field f, uint64_t v, int flags)
{
	switch (f) {
	case lev: return take(vyr_lev_get_text(static_cast<uint8_t>(v), flags));
	case ilev: return take(vyr_ilev_get_text(static_cast<uint8_t>(v), flags));
	case cat: return take(vyr_cat_get_text(v, flags));
	default: return take(vyr_type_get_text(static_cast<uint16_t>(v), flags));
	}
}

TEST_F(TextOut, Fields)
{
	const struct {
		Field field;
		uint64_t value;
		int flags;
		const char *obstack;            // "-1:" and the text left behind on failure
		const char *get_text = nullptr;  // if other than the obstack's text (or NULL)
	} rows[] = {
		{lev, 5, 0, "secret"},  {lev, 5, N, "5", "secret"},  {lev, 5, R, "secret"}, {lev, 5, N | R, "5", "secret"},
		{lev, 2, 0, "2", "<null>"}, {lev, 2, N, "2"},  {lev, 2, R, "-1:", "2"},  {lev, 2, Z, "2"},
		{lev, 0, 0, "public"},  {lev, 0, Z, ""},  {lev, 0, Z | N, ""},  {lev, 0, Z | R, ""},
		{lev, 255, 0x100, "top"},  // unknown flag bits are ignored...
		{lev, 2, 0x100, "2"},      // ...but get_text gives NULL for exactly 0
		{ilev, 0, 0, "Low"},  {ilev, 0, N, "0", "Low"},  {ilev, 1, N, "1", "High"},  {ilev, 1, Z, "High"},
		{ilev, 2, 0, "2"},    {ilev, 2, R, "-1:"},       {ilev, 2, N | R, "2", "<null>"}, {ilev, 255, Z, "255"},
		{cat, 0x3, 0, "alpha,beta"},
		{cat, 0x6, 0, "beta,0x4"},  // pair lost bit 0x2 to the earlier beta: not written
		{cat, 0x30, 0, "wide"},     // an earlier entry of two bits wins over a later one
		{cat, 0x20, 0, "eps"},    {cat, 0x9, 0, "alpha,0x8"},  {cat, ~0ull, 0, "alpha,beta,wide,face,0xfffffffffffffecc"},
		{cat, 0x0, 0, "0x0"},     {cat, 0x3, R, "alpha,beta"}, {cat, 0x9, R, "-1:alpha"},  {cat, 0x0, R, "-1:"},
		{cat, 0x3, N, "0x3"},     {cat, 0x9, N | R, "0x9"},
		{type, 3, 0, "CCNRA"},    {type, 7, 0, "ALL"},     {type, 1, 0, "ccnr"},  {type, 2, 0, "ccnri"},
		{type, 4, 0, "ehole"},    {type, 5, 0, "ccnr,ehole"},  {type, 6, 0, "ccnri,ehole"},  {type, 0, 0, "0x0"},
		{type, 9, 0, "ccnr,0x8"}, {type, 16, 0, "0x10"},
		{type, 0xb, 0, "ccnr,ccnri,0x8"},  // 3 and another bit is no composite
		{type, 0xffff, 0, "ccnr,ccnri,ehole,0xfff8"},  {type, 3, N, "0x3"},  {type, 16, R | Z, "0x10"},
	};
	for (const auto &r : rows) {
		SCOPED_TRACE(testing::Message() << "field " << r.field << " value " << r.value << " flags " << r.flags);
		textmem_clear_stats();
		EXPECT_EQ(field_obstack(r.field, r.value, r.flags), r.obstack);
		const bool failed = std::strncmp(r.obstack, "-1:", 3) == 0;
		EXPECT_EQ(field_get_text(r.field, r.value, r.flags), r.get_text ? r.get_text : failed ? "<null>" : r.obstack);
		// Only a category or level written by name opens its database, and
		// every open is closed.
		EXPECT_EQ(stats().cat_opens, r.field == cat && !(r.flags & N) ? 2 : 0);
		EXPECT_EQ(stats().cat_closes + stats().lev_closes, stats().cat_opens + stats().lev_opens);
		EXPECT_TRUE(r.field == lev || stats().lev_opens == 0);
	}
}

TEST_F(TextOut, CategoryZeroIsLookedUpAsAValue)
{
	textmem_add_category("nothing", 0x0);
	EXPECT_EQ(written([](obstack *o) { return vyr_cat_obstack(0, o, R); }), "nothing");
	EXPECT_EQ(written([](obstack *o) { return vyr_cat_obstack(0, o, N); }), "0x0");
	// In a walk an entry of value 0 claims nothing and is never written.
	EXPECT_EQ(written([](obstack *o) { return vyr_cat_obstack(0x1, o, 0); }), "alpha");
	EXPECT_EQ(stats().cat_lookups, 1);
	EXPECT_EQ(stats().cat_sets, 1);
}

// One pass over the database for the whole mask, stopped once all bits are
// named; a walk that can't start is a failure.
TEST_F(TextOut, CategoryWalk)
{
	EXPECT_EQ(written([](obstack *o) { return vyr_cat_obstack(0x3, o, 0); }), "alpha,beta");
	EXPECT_EQ(stats().cat_nexts, 2);
	EXPECT_EQ(stats().cat_ends, 1);
	textmem_clear_stats();
	EXPECT_EQ(written([](obstack *o) { return vyr_cat_obstack(0x9, o, 0); }), "alpha,0x8");
	EXPECT_EQ(stats().cat_nexts, 7);  // six entries and the end
	EXPECT_EQ(stats().cat_sets + stats().cat_ends + stats().cat_opens + stats().cat_closes, 4);

	textmem_set_catset_result(-1);
	EXPECT_EQ(written([](obstack *o) { return vyr_cat_obstack(0x3, o, 0); }), "-1:");
	EXPECT_EQ(written([](obstack *o) { return vyr_cat_obstack(0x0, o, 0); }), "0x0");  // no walk
	EXPECT_EQ(stats().cat_closes, stats().cat_opens);
}

// A level needs its database unless written as a number or left out; a
// category falls back to the mask.
TEST_F(TextOut, DatabasesUnavailable)
{
	textmem_set_open_ok(false, false);
	EXPECT_EQ(written([](obstack *o) { return vyr_lev_obstack(5, o, 0); }), "-1:");
	EXPECT_EQ(written([](obstack *o) { return vyr_lev_obstack(2, o, Z); }), "-1:");
	EXPECT_EQ(written([](obstack *o) { return vyr_lev_obstack(5, o, N); }), "5");
	EXPECT_EQ(written([](obstack *o) { return vyr_lev_obstack(0, o, Z); }), "");
	EXPECT_EQ(take(vyr_lev_get_text(5, N)), "<null>");
	EXPECT_EQ(take(vyr_lev_get_text(0, Z)), "");
	EXPECT_EQ(written([](obstack *o) { return vyr_cat_obstack(0x9, o, 0); }), "0x9");
	EXPECT_EQ(written([](obstack *o) { return vyr_cat_obstack(0x9, o, R); }), "-1:");
}

TEST_F(TextOut, RoleParts)
{
	const struct {
		bool first, second;  // lists 2,1 and 3
		int flags;
		const char *text;
	} rows[] = {
		{false, false, 0, "No:No"}, {false, false, N, ":"},   {false, false, Z, ""},
		{true, false, 0, "2,1:No"}, {true, false, N, "2,1:"}, {true, false, Z, "2,1"},
		{false, true, 0, "No:3"},   {false, true, N, ":3"},   {false, true, Z, ":3"},
		{true, true, Z, "2,1:3"},   {false, false, N | Z, ":"}, {false, false, R, "No:No"},
	};
	StackLabel lab(0, 0, 0, 0);
	for (const auto &r : rows) {
		SCOPED_TRACE(testing::Message() << r.first << r.second << " flags " << r.flags);
		lab.set_roles(r.first ? std::initializer_list<uint64_t>{2, 1} : std::initializer_list<uint64_t>{},
		              r.second ? std::initializer_list<uint64_t>{3} : std::initializer_list<uint64_t>{});
		EXPECT_EQ(written([&](obstack *o) { return vyrrl_obstack(&lab.rl, o, r.flags); }), r.text);
		EXPECT_EQ(take(vyrrl_get_text(&lab.rl, r.flags)), r.text);
	}
	lab.set_roles({UINT64_MAX, 0x8000000000000000ull, 12}, {0x7fffffffffffffffull});  // signed decimal
	EXPECT_EQ(take(vyrrl_get_text(&lab.rl, 0)), "-1,-9223372036854775808,12:9223372036854775807");
}

TEST_F(TextOut, WholeLabels)
{
	const struct {
		uint8_t lev, ilev;
		uint64_t cat;
		uint16_t type;
		bool roles;
		int flags;
		const char *text;
	} rows[] = {
		{2, 1, 0, 0, false, 0, "2:High:0x0:0x0!No:No"},
		{2, 1, 0, 0, false, N, "2:1:0x0:0x0!:"},
		{0, 0, 0, 3, false, Z, ":Low:0x0:CCNRA!"},
		{5, 0, 0x3, 5, true, 0, "secret:Low:alpha,beta:ccnr,ehole!2,1:3"},
		{0, 1, 0x9, 7, true, Z, ":High:alpha,0x8:ALL!2,1:3"},
		{5, 1, 0x3, 3, false, R, "secret:High:alpha,beta:CCNRA!No:No"},
		{2, 1, 0x3, 3, false, R, "<null>"},
		{5, 2, 0x3, 3, false, R, "<null>"},
	};
	for (const auto &r : rows) {
		SCOPED_TRACE(r.text);
		StackLabel lab(r.lev, r.ilev, r.cat, r.type);
		if (r.roles)
			lab.set_roles({2, 1}, {3});
		const std::string text = r.text;
		EXPECT_EQ(take(vyrl_get_text(&lab.l, r.flags)), text);
		EXPECT_EQ(take(vyrl_asprintf(&lab.l, "%F%Gm!%Gr", r.flags)), text);
		const size_t bang = text.find('!');
		if (bang != std::string::npos) {
			EXPECT_EQ(written([&](obstack *o) { return vyrl_obstack(&lab.l, o, r.flags); }), text);
			EXPECT_EQ(take(vyrml_get_text(&lab.ml, r.flags)), text.substr(0, bang));
			EXPECT_EQ(take(vyrrl_get_text(&lab.rl, r.flags)), text.substr(bang + 1));
		} else {
			EXPECT_EQ(take(vyrml_get_text(&lab.ml, r.flags)), "<null>");
		}
	}
	// On the caller's obstack the fields before the failure stay.
	StackLabel partial(5, 1, 0x9, 3);
	EXPECT_EQ(written([&](obstack *o) { return vyrml_obstack(&partial.ml, o, R); }), "-1:secret:High:alpha");
}

// Names cost one open, lookup and close per conversion; numbers none.
TEST_F(TextOut, DatabaseWorkPerConversion)
{
	StackLabel lab(5, 1, 0x3, 3, {2}, {});
	EXPECT_EQ(take(vyrl_asprintf(&lab.l, "%Nl%Nc%i%t%r")), "50x3HighCCNRA2:No");
	EXPECT_EQ(stats().lev_opens + stats().cat_opens, 0);
	EXPECT_EQ(take(vyrl_asprintf(&lab.l, "%l %c %l")), "secret alpha,beta secret");
	const textmem_stats s = stats();
	EXPECT_EQ(s.lev_opens, 2);
	EXPECT_EQ(s.lev_closes, 2);
	EXPECT_EQ(s.lev_lookups, 2);
	EXPECT_EQ(s.cat_opens, 1);
	EXPECT_EQ(s.cat_closes, 1);
}

// Each use looks its word up afresh, in the domain "vyr"; translations are
// written as they stand; numbers and type names are never translated.
TEST_F(TextOut, FixedWordsAreTranslatedAtEachUse)
{
	StackLabel lab(2, 1, 0, 0);
	const long before = translation_lookups();
	EXPECT_EQ(take(vyrl_get_text(&lab.l, 0)), "2:High:0x0:0x0!No:No");
	EXPECT_EQ(translation_lookups() - before, 3);
	{
		static constexpr Words kOdd = {"%s%%", "H!gh:1", "Aucun", "|aucun"};
		ScopedTranslation odd(kOdd);
		EXPECT_EQ(take(vyrl_get_text(&lab.l, 0)), "2:H!gh:1:0x0:0x0!Aucun|aucun");
		EXPECT_EQ(take(vyr_ilev_get_text(0, N)), "%s%%");
		EXPECT_EQ(take(vyrl_get_text(&lab.l, N)), "2:1:0x0:0x0!:");
		EXPECT_EQ(take(vyr_type_get_text(3, 0)), "CCNRA");
	}
	EXPECT_EQ(take(vyrl_get_text(&lab.l, 0)), "2:High:0x0:0x0!No:No");  // nothing kept
	EXPECT_EQ(translation_lookups() - before, 10);
	EXPECT_FALSE(foreign_lookup_seen());
}

TEST_F(TextOut, FinishCopiesTheObjectAndReleasesTheObstack)
{
	struct obstack o;
	_obstack_begin(&o, 0, 0, [](long n) { return std::malloc(static_cast<size_t>(n)); }, std::free);
	EXPECT_EQ(take(vyr_obstack_finish(&o)), "");
	_obstack_begin(&o, 0, 0, [](long n) { return std::malloc(static_cast<size_t>(n)); }, std::free);
	const std::string big(10000, 'x');  // several chunks; the sanitizers see a leak or a double free
	obstack_grow(&o, big.data(), big.size());
	EXPECT_EQ(take(vyr_obstack_finish(&o)), big);
}

} // namespace
} // namespace text_test
