// The label format engine, directive by directive.
#include "repr/textout_fixture.hh"

#include <cstring>

namespace textout_test {
namespace {

struct EngineCase {
	const char *format;
	int arg0, arg1; // ints for the F directives; the engine reads no others
	const char *expected;
};

// Label: lev 5 ("secret"), ilev 1, cat 0x3 (alpha,beta), type 3 (CCNRA),
// roles 2,1 : 3.
const EngineCase kEngineCases[] = {
	{"", 0, 0, ""},
	{"plain text", 0, 0, "plain text"},
	{"\xc3\xa9t\xc3\xa9 %t", 0, 0, "\xc3\xa9t\xc3\xa9 CCNRA"},
	{"100%%", 0, 0, "100%"},
	{"%%%l", 0, 0, "%secret"},
	{"end%", 0, 0, "end"},
	// width and justification are read and ignored
	{"%-007l", 0, 0, "secret"},
	{"%12t|%-3i|%0c", 0, 0, "CCNRA|High|alpha,beta"},
	// unknown conversion letters are swallowed
	{"%x", 0, 0, ""},
	{"[%Q%y]", 0, 0, "[]"},
	{"%-%", 0, 0, ""},
	{"%N%l", 0, 0, "l"},
	// F behind a flag letter is an unknown conversion and takes no argument
	{"%NF%F%Gi", 1, 0, "1"},
	{"%NF", 0, 0, ""},
	// a second N right behind an N ends the directive
	{"%NNl", 0, 0, "l"},
	{"%GNNl", 1, 0, "l"},
	{"%NRNl", 0, 0, "5"},
	{"%RNZl", 0, 0, "5"},
	// the stored flag word: only G brings it in, and F replaces it
	{"%Gl", 0, 0, "secret"},
	{"%F%Gl", 1, 0, "5"},
	{"%Gl%F%Gl", 1, 0, "secret5"},
	{"%F%Gl%F%Gl", 1, 0, "5secret"},
	{"%-03F%Gl", 1, 0, "5"},
	{"%F%Nl %l", 1, 0, "5 secret"},
	{"%F%Gi:%i:%GNi", 0, 0, "High:High:1"},
	{"%F%GZl", 1, 0, "5"},
	// every conversion
	{"%l|%i|%c|%t", 0, 0, "secret|High|alpha,beta|CCNRA"},
	{"%Nl|%Ni|%Nc|%Nt", 0, 0, "5|1|0x3|0x3"},
	{"%m", 0, 0, "secret:High:alpha,beta:CCNRA"},
	{"%Nm", 0, 0, "5:1:0x3:0x3"},
	{"%r", 0, 0, "2,1:3"},
	{"%F%Gm!%Gr", 1, 0, "5:1:0x3:0x3!2,1:3"},
	// a format that ends inside a directive ends there
	{"a%-", 0, 0, "a"},
	{"a%007", 0, 0, "a"},
	{"a%N", 0, 0, "a"},
	{"a%GZR", 0, 0, "a"},
};

void PrintTo(const EngineCase &c, std::ostream *os)
{
	*os << '"' << c.format << "\" F(" << c.arg0 << "," << c.arg1 << ")";
}

class EngineTable : public TextOut, public ::testing::WithParamInterface<EngineCase> {};

TEST_P(EngineTable, WritesAndCounts)
{
	const EngineCase &c = GetParam();
	StackLabel lab(5, 1, 0x3, 3, {2, 1}, {3});
	Obstack o;
	obstack_grow(o.get(), "<", 1); // text already on the caller's obstack stays
	const int n = vyrl_obstack_printf(&lab.l, o.get(), c.format, c.arg0, c.arg1);
	EXPECT_EQ(o.text(), std::string("<") + c.expected) << "format " << c.format;
	EXPECT_EQ(n, static_cast<int>(std::strlen(c.expected))) << "format " << c.format;

	EXPECT_EQ(take(vyrl_asprintf(&lab.l, c.format, c.arg0, c.arg1)), c.expected);
}

INSTANTIATE_TEST_SUITE_P(TextOutDirectives, EngineTable, ::testing::ValuesIn(kEngineCases));

TEST_F(TextOut, PartFormsPassOnlyTheirPart)
{
	StackLabel lab(5, 0, 0x1, 1, {7}, {});
	Obstack a, b;
	const std::string ml_text = "secret/Low/alpha/ccnr/secret:Low:alpha:ccnr";
	EXPECT_EQ(vyrml_obstack_printf(&lab.ml, a.get(), "%l/%i/%c/%t/%m"), int(ml_text.size()));
	EXPECT_EQ(a.text(), ml_text);
	const std::string rl_text = "(7:No)(7:)(7)";
	EXPECT_EQ(vyrrl_obstack_printf(&lab.rl, b.get(), "(%r)(%Nr)(%Zr)"), int(rl_text.size()));
	EXPECT_EQ(b.text(), rl_text);
	EXPECT_EQ(take(vyrml_asprintf(&lab.ml, "%F%Gl", VYR_TEXT_NUMERIC)), "5");
	EXPECT_EQ(take(vyrrl_asprintf(&lab.rl, "<%r>")), "<7:No>");
}

TEST_F(TextOut, FailedConversionStopsTheEngine)
{
	StackLabel lab(2, 0, 0x8, 0); // level 2 and bit 0x8 have no names
	Obstack o;
	EXPECT_EQ(vyrml_obstack_printf(&lab.ml, o.get(), "x%Rl y%l"), -1);
	EXPECT_EQ(o.text(), "x");

	Obstack p;
	EXPECT_EQ(vyrml_obstack_printf(&lab.ml, p.get(), "%l:%Rc:%t"), -1);
	EXPECT_EQ(p.text(), "2:");

	EXPECT_EQ(take(vyrml_asprintf(&lab.ml, "%F%Gm", VYR_TEXT_NAMED_ONLY)), "<null>");
	EXPECT_EQ(take(vyrml_asprintf(&lab.ml, "%Gm", VYR_TEXT_NAMED_ONLY)), "2:Low:0x8:0x0");
}

TEST_F(TextOut, NumericTextTouchesNoDatabase)
{
	StackLabel lab(5, 1, 0x3, 3, {2}, {});
	EXPECT_EQ(take(vyrl_get_text(&lab.l, VYR_TEXT_NUMERIC)), "5:1:0x3:0x3!2:");
	EXPECT_EQ(take(vyrl_asprintf(&lab.l, "%Nl%Nc%i%t%r")), "50x3HighCCNRA2:No");
	const textoutmem_stats s = stats();
	EXPECT_EQ(s.lev_opens, 0);
	EXPECT_EQ(s.cat_opens, 0);
}

TEST_F(TextOut, NamedTextOpensEachDatabaseOncePerConversion)
{
	StackLabel lab(5, 1, 0x3, 3);
	EXPECT_EQ(take(vyrl_asprintf(&lab.l, "%l %c %l")), "secret alpha,beta secret");
	const textoutmem_stats s = stats();
	EXPECT_EQ(s.lev_opens, 2);
	EXPECT_EQ(s.lev_closes, 2);
	EXPECT_EQ(s.lev_lookups, 2);
	EXPECT_EQ(s.cat_opens, 1);
	EXPECT_EQ(s.cat_closes, 1);
	EXPECT_EQ(s.cat_sets, 1);
	EXPECT_EQ(s.cat_ends, 1);
}

} // namespace
} // namespace textout_test
