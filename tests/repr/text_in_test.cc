// The label text readers, table by table, against the in-memory back-end,
// which also counts the database work they do. Each reader's result is
// spelled as a string: its value on success, "-1" on a failure that left
// the out value alone, and "-1:" with the value left on a failure that
// didn't.
#include "support/memdb/textmem.h"
#include "repr/text_support.hh"

#include "support/failalloc.h"

#include <cerrno>
#include <memory>
#include <sstream>

namespace text_test {
namespace {

using TextIn = TextTest;

template <class T>
std::string outcome(int rc, T value, T sentinel, bool hex = false)
{
	std::ostringstream s;
	if (rc != 0)
		s << rc << (value == sentinel ? "" : ":");
	if (rc == 0 || value != sentinel)
		s << (hex ? std::hex : std::dec) << (hex ? "0x" : "") << uint64_t{value};
	return s.str();
}

std::string lev(const char *text)
{
	uint8_t v = 0xaa;
	const int rc = vyr_lev_from_text(text, &v);
	return outcome(rc, v, uint8_t{0xaa});
}

std::string ilev(const char *text)
{
	uint8_t v = 0xaa;
	errno = 0;
	const int rc = vyr_ilev_from_text(text, &v);
	EXPECT_EQ(errno, rc == 0 ? 0 : EINVAL);
	return outcome(rc, v, uint8_t{0xaa});
}

// Both forms of the category reader must agree; the copying one leaves the
// text alone.
std::string cat(const char *text)
{
	std::vector<char> b = buffer(text);
	uint64_t copied = 0x5555, in_place = 0x5555;
	const int rc = vyr_cat_from_text(chars(b), &copied);
	EXPECT_EQ(b, buffer(text));
	EXPECT_EQ(vyr_cat_from_text_nc(chars(b), &in_place), rc);
	EXPECT_EQ(in_place, copied);
	return outcome(rc, copied, uint64_t{0x5555}, true);
}

std::string type(const char *text)
{
	uint16_t v = 0x5a5a;
	const int rc = vyr_type_from_text(text, &v);
	return outcome(rc, v, uint16_t{0x5a5a}, true);
}

std::string role(const char *text)
{
	vyr_role_t r{99, 7, 3};
	const int rc = vyr_role_from_text(&r, text);
	EXPECT_EQ(r.attr + r.rights, rc == 0 ? 0u : 10u);  // cleared, or left alone
	return outcome(rc, r.id, uint64_t{99});
}

std::string ids(const vyr_role_t *roles, uint32_t n)
{
	std::string s;
	for (uint32_t i = 0; i < n; ++i)
		s += (i ? "," : "") + std::to_string(roles[i].id);
	EXPECT_EQ(n == 0, roles == nullptr) << "an empty list is NULL";
	return s;
}

std::string roles(const char *text)
{
	std::vector<char> b = buffer(text);
	vyr_role_t *const sentinel = reinterpret_cast<vyr_role_t *>(&b);
	vyr_role_t *list = sentinel;
	uint32_t count = 77;
	if (vyr_roles_from_text(chars(b), &list, &count) != 0) {
		EXPECT_TRUE(list == sentinel && count == 77) << "list written on failure";
		return "-1";
	}
	std::string s = ids(list, count);
	std::free(list);
	return s;
}

// A record as "lev:ilev:cat:type", "roles1:roles2" or both joined by "!".
std::string fields(const vyrml_t *ml)
{
	EXPECT_EQ(vyrml_ucnt(ml), 1);
	EXPECT_EQ(ml->blob, nullptr);
	std::ostringstream s;
	s << int{ml->lev} << ':' << int{ml->ilev} << std::hex << ":0x" << ml->cat << ":0x" << ml->type;
	return s.str();
}
std::string fields(const vyrrl_t *rl)
{
	EXPECT_EQ(vyrrl_ucnt(rl), 1);
	return ids(rl->roles1, rl->nroles1) + ":" + ids(rl->roles2, rl->nroles2);
}
std::string fields(const vyrl_t *l)
{
	EXPECT_EQ(vyrl_ucnt(l), 1);
	return fields(l->ml) + "!" + fields(l->rl);
}
// Both forms of a record reader, which must agree; "<null>" for failure.
template <class R>
std::string record(const char *text, R *(*copying)(const char *), R *(*in_place)(char *), void (*put)(R *))
{
	std::vector<char> b = buffer(text);
	std::unique_ptr<R, void (*)(R *)> a(copying(chars(b)), put);
	EXPECT_EQ(b, buffer(text)) << "the copying form changed the text";
	std::unique_ptr<R, void (*)(R *)> c(in_place(chars(b)), put);
	const std::string sa = a ? fields(a.get()) : "<null>";
	EXPECT_EQ(sa, c ? fields(c.get()) : "<null>") << "the two forms disagree";
	return sa;
}
std::string ml(const char *t) { return record(t, vyrml_get_from_text, vyrml_get_from_text_nc, vyrml_put); }
std::string rl(const char *t) { return record(t, vyrrl_get_from_text, vyrrl_get_from_text_nc, vyrrl_put); }
std::string whole(const char *t) { return record(t, vyrl_get_from_text, vyrl_get_from_text_nc, vyrl_put); }

inline constexpr Words kSwapped = {"High", "Low", nullptr, nullptr};

struct Row {
	std::string (*read)(const char *);
	const char *text;
	const char *want;
	const Words *words = nullptr;  // read under this test translation
};

TEST_F(TextIn, Table)
{
	const Row rows[] = {
		{lev, "secret", "5"}, {lev, "12", "7"},  // a name beats the number it spells
		{lev, "13", "13"},    {lev, " 13", "13"}, {lev, "12abc", "12"}, {lev, "300", "44"},
		{lev, "-1", "255"},   {lev, "", "0"},     {lev, nullptr, "0"},     {lev, "Secret", "-1"}, {lev, "x1", "-1"},
		{ilev, "Low", "0"},   {ilev, "High", "1"}, {ilev, "257", "1"},   {ilev, "7x", "7"},
		{ilev, "", "0"},      {ilev, nullptr, "0"}, {ilev, "low", "-1"}, {ilev, "secret", "-1"}, {ilev, "Niedrig", "-1"},
		{ilev, "Niedrig", "0", &kGerman}, {ilev, "Hoch", "1", &kGerman}, {ilev, "High", "1", &kGerman},
		{ilev, "Nein", "-1", &kGerman},
		{ilev, "High", "0", &kSwapped},  // the translated "Low" is tried before the plain "High"
		{cat, "alpha,beta", "0x3"}, {cat, "face", "0x100"},  // the name, not the number
		{cat, "0xface", "0xface"},  {cat, "beta,0x8", "0xa"}, {cat, "wide", "0x30"},
		{cat, ",,,", "0x0"},        {cat, "1,,2", "0x3"},     {cat, "a,b", "0xb"},
		{cat, " 10", "0x10"},       {cat, "-1", "0xffffffffffffffff"}, {cat, "", "0x0"},  {cat, nullptr, "0x0"},
		{cat, "zz", "-1:0x0"},      {cat, "alpha,zz,beta", "-1:0x1"},  // bits before the bad token stay
		{cat, "0x", "-1:0x0"},      {cat, "alpha beta", "-1:0x0"},   {cat, " alpha", "-1:0x0"},
		{type, "CCNRA", "0x3"},     {type, "ALL", "0x7"},      {type, "ccnr,ehole", "0x5"},
		{type, "ccnri", "0x2"},     {type, "0x9", "0x9"},
		{type, "ccnr,0x8", "0x8"},  // a number replaces the names before it
		{type, "10,ccnr", "0x11"},  // a later name ORs into a number
		{type, "ccnr,", "0x0"},     {type, "ccnr,,ehole", "0x4"},  // empty tokens are the number 0
		{type, "12345", "0x2345"},  {type, "fffffffffffffffffffff", "0xffff"}, {type, "", "0x0"}, {type, nullptr, "0x0"},
		{type, "x", "-1:0x0"},      {type, "CCNR", "-1:0xcc"},  // names are case sensitive
		{type, "ccnr:x", "-1:0xcc"},
		{role, "5", "5"},           {role, "12abc", "12"},     {role, "-1", "18446744073709551615"},
		{role, "No", "0"},          {role, "", "0"},  {role, nullptr, "0"},           {role, "x", "-1"},  {role, "no", "-1"},
		{role, "Nein", "0", &kGerman},  {role, "No", "0", &kGerman},
		{roles, "1,2,3", "3,2,1"},  {roles, "3,3,1", "3,1"},   {roles, "5,", "5,0"},  // empty token: role 0
		{roles, "No,4", "4,0"},     {roles, "0,-1", "18446744073709551615,0"},  // unsigned order
		{roles, "No", ""},          {roles, "", ""},           {roles, nullptr, ""},
		{roles, "Nein", "", &kGerman},  {roles, "x", "-1"},        {roles, "1,,y", "-1"},
		// records, read in both forms
		{ml, "5", "5:0:0x0:0x0"},  {ml, "::", "0:0:0x0:0x0"},  {ml, "1:High", "1:1:0x0:0x0"},
		{ml, "secret:High:alpha,beta:CCNRA", "5:1:0x3:0x3"},
		{ml, "300:2:face:ccnr,ehole", "44:2:0x100:0x5"},
		{ml, "1:0:0:ccnr:x", "<null>"},  // further ':' belong to the type text
		{ml, "bogus", "<null>"}, {ml, "1:bogus", "<null>"}, {ml, "1:0:zz", "<null>"}, {ml, "1:0:0:zz", "<null>"},
		{rl, "No:No", ":"},   {rl, ":", ":"},      {rl, "No", ":"},       {rl, "2,1", "2,1:"},
		{rl, ":3", ":3"},     {rl, "1:2:3", "1:2"},  // "%lu" stops at the second ':'
		{rl, "1,3,2:5,5", "3,2,1:5"}, {rl, "Nein:Nein", ":", &kGerman}, {rl, "No:Nein", ":", &kGerman},
		{rl, "x:1", "<null>"}, {rl, "1:x", "<null>"}, {rl, "1:2,:No", "<null>"},
		{whole, "!", "0:0:0x0:0x0!:"},
		{whole, "2:High:0x0:0x0!No:No", "2:1:0x0:0x0!:"},
		{whole, ":Low:0x0:CCNRA!", "0:0:0x0:0x3!:"},
		{whole, "secret:Low:alpha,wide:ehole!9,5:1", "5:0:0x31:0x4!9,5:1"},
		{whole, "top", "255:0:0x0:0x0!:"},
		{whole, "1!2!3", "1:0:0x0:0x0!2:"},  // only the first '!' separates
		{whole, "x!1", "<null>"}, {whole, "1:2:3!x", "<null>"},
	};
	for (const Row &r : rows) {
		SCOPED_TRACE(testing::Message() << '"' << (r.text ? r.text : "(null)") << '"' << (r.words ? " translated" : ""));
		set_translation(r.words);
		vyr_test::FailAlloc::reset();
		{
			vyr_test::Injector none(0);  // fails nothing, but notes every block
			EXPECT_EQ(none.run([&] { return r.read(r.text); }), r.want);
		}
		EXPECT_EQ(vyr_test::FailAlloc::live(), 0u) << "blocks left behind";
	}
}

// A stale ERANGE from before the call must not make all ones an overflow;
// the reader's own overflow is a failure and leaves ERANGE.
TEST_F(TextIn, CategoryOverflow)
{
	uint64_t mask = 0;
	errno = ERANGE;
	EXPECT_EQ(vyr_cat_from_text("ffffffffffffffff", &mask), 0);
	EXPECT_EQ(mask, ~0ull);
	errno = 0;
	EXPECT_EQ(vyr_cat_from_text("beta,10000000000000000", &mask), -1);
	EXPECT_EQ(mask, 0x2u);
	EXPECT_EQ(errno, ERANGE);
}

// Which separators each in-place reader cuts, also when it fails.
TEST_F(TextIn, InPlaceReadersCutTheirSeparators)
{
	const auto cuts = [](const std::vector<char> &b) {
		std::string at;
		for (size_t i = 0; i < b.size() - 1; ++i)
			if (b[i] == '\0')
				at += std::to_string(i) + " ";
		return at;
	};
	std::vector<char> b = buffer(",alpha,,beta,0x8,");
	uint64_t mask = 0;
	EXPECT_EQ(vyr_cat_from_text_nc(b.data(), &mask), 0);
	EXPECT_EQ(cuts(b), "6 12 16 ");  // only the comma behind each token
	b = buffer("4,,9,1");
	vyr_role_t *list = nullptr;
	uint32_t count = 0;
	EXPECT_EQ(vyr_roles_from_text(b.data(), &list, &count), 0);
	EXPECT_EQ(cuts(b), "1 2 4 ");
	EXPECT_EQ(list[2].id, 1u);
	std::free(list);
	b = buffer("1:2:alpha,beta:ccnr,ehole:x");  // bad type; the cat and type commas stay
	EXPECT_EQ(vyrml_get_from_text_nc(b.data()), nullptr);
	EXPECT_EQ(cuts(b), "1 3 14 ");
	b = buffer("2,1:3,4:5");
	vyrrl_t *r = vyrrl_get_from_text_nc(b.data());
	EXPECT_EQ(r ? fields(r) : "", "2,1:4,3");
	vyrrl_put(r);
	EXPECT_EQ(cuts(b), "1 3 5 ");
	b = buffer("1:0:alpha,beta!4,x");
	EXPECT_EQ(vyrl_get_from_text_nc(b.data()), nullptr);
	EXPECT_EQ(cuts(b), "1 3 14 16 ");
}

// NULL and the empty text give a fresh copy of the zero label's record.
TEST_F(TextIn, EmptyTextIsAFreshZeroRecord)
{
	for (vyrl_t *l : {vyrl_get_from_text(nullptr), vyrl_get_from_text(""), vyrl_get_from_text_nc(nullptr)}) {
		ASSERT_NE(l, nullptr);
		EXPECT_TRUE(l != VYRL_ZERO && l->ml != VYRL_ZERO->ml && l->rl != VYRL_ZERO->rl);
		EXPECT_EQ(vyrl_cmp(l, VYRL_ZERO, 0), 1);
		vyrl_put(l);
	}
	for (vyrml_t *m : {vyrml_get_from_text(nullptr), vyrml_get_from_text_nc(nullptr)}) {
		EXPECT_TRUE(m != nullptr && m != VYRL_ZERO->ml);
		vyrml_put(m);
	}
	vyrrl_t *r = vyrrl_get_from_text("");
	EXPECT_TRUE(r != nullptr && r != VYRL_ZERO->rl);
	vyrrl_put(r);
	EXPECT_EQ(vyrl_ucnt(VYRL_ZERO), 1);
}

// One open of each database and one lookup per name token for a whole
// label, nothing for texts without names, and every open closed, also on
// failure.
TEST_F(TextIn, DatabaseWork)
{
	// whole() reads with both forms: each costs one open and lookup of the
	// level database, one open of the category database, four lookups.
	EXPECT_EQ(whole("secret:High:alpha,,beta,0x8,face:ehole!2:1"), "5:1:0x10b:0x4!2:1");
	textmem_stats s = textmem_get_stats();
	EXPECT_EQ(s.lev_opens, 2);
	EXPECT_EQ(s.lev_lookups, 2);
	EXPECT_EQ(s.cat_opens, 2);
	EXPECT_EQ(s.cat_lookups, 8);

	textmem_clear_stats();
	const std::vector<std::string> got = {lev(""), ilev("High"), cat(""), type("ccnr"), roles("3,2"), rl("3:1"), whole("")};
	EXPECT_EQ(got, (std::vector<std::string>{"0", "1", "0x0", "0x1", "3,2", "3:1", "0:0:0x0:0x0!:"}));
	EXPECT_EQ(textmem_get_stats().lev_opens + textmem_get_stats().cat_opens, 0);

	EXPECT_EQ(cat("alpha,zz,beta"), "-1:0x1");
	EXPECT_EQ(whole("secret:Low:alpha:bogus!"), "<null>");
	s = textmem_get_stats();
	EXPECT_EQ(s.cat_lookups, 2 * 2 + 2);  // the reader stops at the bad token
	EXPECT_EQ(s.lev_opens, s.lev_closes);
	EXPECT_EQ(s.cat_opens, s.cat_closes);
}

// Without their databases, levels and categories are still read as numbers.
TEST_F(TextIn, DatabasesUnavailable)
{
	textmem_set_open_ok(false, false);
	EXPECT_EQ(lev("12"), "12");
	EXPECT_EQ(lev("secret"), "-1");
	EXPECT_EQ(cat("face,0x10000"), "0x1face");
	EXPECT_EQ(cat("alpha"), "-1:0x0");
	EXPECT_EQ(whole("7:High:0x5:ccnr!3,9:No"), "7:1:0x5:0x1!9,3:");
	EXPECT_EQ(textmem_get_stats().lev_lookups + textmem_get_stats().cat_lookups, 0);
}

} // namespace
} // namespace text_test
