// The text readers, table by table, against a back-end that serves the names
// of textin_support.hh (the in-memory plug-in or the real files back-end,
// depending on the program this file is linked into).
#include <vyr/label.h>
#include <vyr/text.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "repr/textin_support.hh"

namespace {

using namespace textin_test;

constexpr uint64_t kAllOnes = ~0ull;

class TextIn : public ::testing::Test {
protected:
	static void SetUpTestSuite() { start_databases(); }
	void SetUp() override
	{
		if (!backend().has_names)
			GTEST_SKIP() << "back-end serves no names";
	}
};

// A writable copy of a text for the in-place readers, with its terminating
// NUL, so that tests can look at every byte afterwards.
std::vector<char> buffer(const char *text)
{
	return std::vector<char>(text, text + std::strlen(text) + 1);
}

// The same bytes with every position in `cuts` turned into NUL.
std::vector<char> cut(const char *text, std::initializer_list<size_t> cuts)
{
	std::vector<char> b = buffer(text);
	for (size_t at : cuts)
		b.at(at) = '\0';
	return b;
}

// ---- levels ------------------------------------------------------------

struct LevRow {
	const char *text;
	int result;
	uint8_t value;  // expected on success; on failure the sentinel stays
};

TEST_F(TextIn, LevelTable)
{
	const LevRow rows[] = {
		{"secret", 0, 5},
		{"topsecret", 0, 200},
		{"unclassified", 0, 1},
		{"12", 0, 7},         // a name beats the number it spells
		{"13", 0, 13},
		{" 13", 0, 13},       // blanks before a number
		{"12abc", 0, 12},     // the number stops at the first other character
		{"300", 0, 44},       // kept modulo 256
		{"-1", 0, 255},
		{"+9", 0, 9},
		{"", 0, 0},
		{"secret2", -1, 0},
		{"Secret", -1, 0},    // names are exact
		{" ", -1, 0},
		{"x1", -1, 0},
	};
	for (const LevRow &r : rows) {
		uint8_t lev = 0xaa;
		EXPECT_EQ(vyr_lev_from_text(r.text, &lev), r.result) << '"' << r.text << '"';
		EXPECT_EQ(lev, r.result == 0 ? r.value : 0xaa) << '"' << r.text << '"';
	}
	uint8_t lev = 0xaa;
	EXPECT_EQ(vyr_lev_from_text(nullptr, &lev), 0);
	EXPECT_EQ(lev, 0);
}

// ---- integrity levels ----------------------------------------------------

struct IlevRow {
	const char *text;
	int result;
	uint8_t value;
};

void check_ilev_rows(const std::vector<IlevRow> &rows)
{
	for (const IlevRow &r : rows) {
		uint8_t ilev = 0xaa;
		errno = 0;
		EXPECT_EQ(vyr_ilev_from_text(r.text, &ilev), r.result) << '"' << r.text << '"';
		if (r.result == 0) {
			EXPECT_EQ(ilev, r.value) << '"' << r.text << '"';
			EXPECT_EQ(errno, 0) << '"' << r.text << '"';
		} else {
			EXPECT_EQ(ilev, 0xaa) << '"' << r.text << '"';
			EXPECT_EQ(errno, EINVAL) << '"' << r.text << '"';
		}
	}
}

TEST_F(TextIn, IntegrityLevelTable)
{
	check_ilev_rows({
		{"Low", 0, 0},
		{"High", 0, 1},
		{"0", 0, 0},
		{"1", 0, 1},
		{"2", 0, 2},
		{"257", 0, 1},
		{"7x", 0, 7},
		{"", 0, 0},
		{"low", -1, 0},
		{"HIGH", -1, 0},
		{"Niedrig", -1, 0},   // no translation is active
		{"secret", -1, 0},    // no database is consulted
		{"x", -1, 0},
	});
	uint8_t ilev = 0xaa;
	EXPECT_EQ(vyr_ilev_from_text(nullptr, &ilev), 0);
	EXPECT_EQ(ilev, 0);
}

TEST_F(TextIn, IntegrityLevelTranslated)
{
	ScopedTranslation german(kGerman);
	check_ilev_rows({
		{"Niedrig", 0, 0},
		{"Hoch", 0, 1},
		{"Low", 0, 0},        // the plain words work in every locale
		{"High", 0, 1},
		{"niedrig", -1, 0},
		{"Nein", -1, 0},
	});
}

TEST_F(TextIn, IntegrityLevelTranslatedLowWinsOverPlainHigh)
{
	// The translated "Low" is tried before the plain "High".
	const Words odd = {"High", "Low", nullptr, nullptr};
	ScopedTranslation t(odd);
	check_ilev_rows({{"High", 0, 0}, {"Low", 0, 0}});
}

// ---- categories ------------------------------------------------------------

struct CatRow {
	const char *text;
	int result;
	uint64_t mask;  // after the call, on success and on failure
	int err;        // errno after a failure, when the reader fixes it (0: not checked)
};

TEST_F(TextIn, CategoryTable)
{
	const CatRow rows[] = {
		{"alpha", 0, 0x1, 0},
		{"alpha,beta", 0, 0x3, 0},
		{"face", 0, 0x100, 0},          // the name, not the number 0xface
		{"0xface", 0, 0xface, 0},
		{"beta,0x8", 0, 0xa, 0},
		{"wide", 0, 0x30, 0},
		{"top,alpha", 0, 0x8000000000000001ull, 0},
		{",,,", 0, 0, 0},
		{"1,,2", 0, 0x3, 0},
		{"a,b", 0, 0xb, 0},              // not names: hexadecimal numbers
		{",alpha,", 0, 0x1, 0},
		{" 10", 0, 0x10, 0},
		{"-1", 0, kAllOnes, 0},
		{"ffffffffffffffff", 0, kAllOnes, 0},
		{"", 0, 0, 0},
		{"zz", -1, 0, 0},
		{"alpha,zz,beta", -1, 0x1, 0},   // bits before the bad token stay
		{"0x", -1, 0, 0},
		{"alpha beta", -1, 0, 0},
		{"beta,10000000000000000", -1, 0x2, ERANGE},
	};
	for (const CatRow &r : rows) {
		for (bool in_place : {false, true}) {
			std::vector<char> text = buffer(r.text);
			uint64_t mask = 0x5555;
			errno = 0;
			const int got = in_place ? vyr_cat_from_text_nc(text.data(), &mask)
			                         : vyr_cat_from_text(text.data(), &mask);
			const std::string what = std::string(in_place ? "_nc \"" : "\"") + r.text + '"';
			EXPECT_EQ(got, r.result) << what;
			EXPECT_EQ(mask, r.mask) << what;
			if (r.err != 0) {
				EXPECT_EQ(errno, r.err) << what;
			}
			if (!in_place) {
				EXPECT_EQ(text, buffer(r.text)) << "copying form changed " << what;
			}
		}
	}
	uint64_t mask = 7;
	EXPECT_EQ(vyr_cat_from_text(nullptr, &mask), 0);
	EXPECT_EQ(mask, 0u);
	mask = 7;
	EXPECT_EQ(vyr_cat_from_text_nc(nullptr, &mask), 0);
	EXPECT_EQ(mask, 0u);
}

TEST_F(TextIn, CategoryAllOnesIsNoOverflowWhateverErrnoHeld)
{
	// Only the reader's own conversion may report an overflow: an ERANGE
	// left over from before the call must not make all ones a failure.
	uint64_t mask = 0;
	errno = ERANGE;
	EXPECT_EQ(vyr_cat_from_text("ffffffffffffffff", &mask), 0);
	EXPECT_EQ(mask, kAllOnes);
}

TEST_F(TextIn, CategoryInPlaceCutsOnlyTheCommaBehindEachToken)
{
	const char *text = ",alpha,,beta,0x8,";
	std::vector<char> b = buffer(text);
	uint64_t mask = 0;
	ASSERT_EQ(vyr_cat_from_text_nc(b.data(), &mask), 0);
	EXPECT_EQ(mask, 0xbu);
	EXPECT_EQ(b, cut(text, {6, 12, 16}));
}

// ---- type ------------------------------------------------------------------

struct TypeRow {
	const char *text;
	int result;
	uint16_t value;  // after the call, on success and on failure
};

TEST_F(TextIn, TypeTable)
{
	const TypeRow rows[] = {
		{"CCNRA", 0, 3},
		{"ALL", 0, 7},
		{"ccnr", 0, 1},
		{"ccnri", 0, 2},
		{"ehole", 0, 4},
		{"ccnr,ehole", 0, 5},
		{"ALL,ccnr", 0, 7},
		{"0x9", 0, 9},
		{"0x0", 0, 0},
		{"ccnr,0x8", 0, 8},              // a number replaces earlier names
		{"10,ccnr", 0, 0x11},            // a later name ORs into a number
		{"ccnr,10", 0, 0x10},
		{"ccnr,", 0, 0},                 // the empty last token is the number 0
		{"ccnr,,ehole", 0, 4},
		{"12345", 0, 0x2345},            // low 16 bits
		{"fffffffffffffffffffff", 0, 0xffff},
		{"", 0, 0},
		{"x", -1, 0},
		{"CCNR", -1, 0xcc},              // names are case sensitive; "CC" reads as hex
		{"ccnr:x", -1, 0xcc},
		{"ehole,12g", -1, 0x12},
	};
	for (const TypeRow &r : rows) {
		uint16_t type = 0x5a5a;
		const std::vector<char> before = buffer(r.text);
		EXPECT_EQ(vyr_type_from_text(r.text, &type), r.result) << '"' << r.text << '"';
		EXPECT_EQ(type, r.value) << '"' << r.text << '"';
		EXPECT_EQ(buffer(r.text), before);
	}
	uint16_t type = 9;
	EXPECT_EQ(vyr_type_from_text(nullptr, &type), 0);
	EXPECT_EQ(type, 0);
}

// ---- single roles ------------------------------------------------------------

struct RoleRow {
	const char *text;
	int result;
	uint64_t id;
};

TEST_F(TextIn, RoleTable)
{
	const RoleRow rows[] = {
		{"5", 0, 5},
		{"12abc", 0, 12},
		{" 7", 0, 7},
		{"-1", 0, kAllOnes},
		{"18446744073709551615", 0, kAllOnes},
		{"No", 0, 0},
		{"", 0, 0},
		{"x", -1, 0},
		{"no", -1, 0},
		{"Nein", -1, 0},
	};
	for (const RoleRow &r : rows) {
		vyr_role_t role{99, 7, 3};
		EXPECT_EQ(vyr_role_from_text(&role, r.text), r.result) << '"' << r.text << '"';
		if (r.result == 0) {
			EXPECT_EQ(role.id, r.id) << '"' << r.text << '"';
			EXPECT_EQ(role.attr, 0u);
			EXPECT_EQ(role.rights, 0u);
		} else {
			EXPECT_EQ(role.id, 99u) << "a failed read changed the role: \"" << r.text << '"';
			EXPECT_EQ(role.attr, 7u);
			EXPECT_EQ(role.rights, 3u);
		}
	}
	vyr_role_t role{99, 7, 3};
	EXPECT_EQ(vyr_role_from_text(&role, nullptr), 0);
	EXPECT_EQ(role.id, 0u);
	EXPECT_EQ(role.attr, 0u);
	EXPECT_EQ(role.rights, 0u);
}

TEST_F(TextIn, RoleTranslatedNo)
{
	ScopedTranslation german(kGerman);
	vyr_role_t role{99, 7, 3};
	EXPECT_EQ(vyr_role_from_text(&role, "Nein"), 0);
	EXPECT_EQ(role.id, 0u);
	role = {99, 7, 3};
	EXPECT_EQ(vyr_role_from_text(&role, "No"), 0);
	EXPECT_EQ(role.id, 0u);
}

// ---- role lists ----------------------------------------------------------------

struct RolesRow {
	const char *text;
	int result;
	std::vector<uint64_t> ids;       // the counted entries, in order
	std::vector<uint64_t> behind;    // entries behind the count
};

std::vector<uint64_t> ids_of(const vyr_role_t *roles, size_t from, size_t to)
{
	std::vector<uint64_t> ids;
	for (size_t i = from; i < to; ++i)
		ids.push_back(roles[i].id);
	return ids;
}

TEST_F(TextIn, RoleListTable)
{
	const RolesRow rows[] = {
		{"1,2,3", 0, {3, 2, 1}, {}},
		{"3,3,1", 0, {3, 1}, {3}},          // the array keeps room for three
		{"5,", 0, {5, 0}, {}},               // an empty token is role 0
		{"No,4", 0, {4, 0}, {}},
		{",,", 0, {0}, {0, 0}},
		{"0,-1", 0, {kAllOnes, 0}, {}},      // unsigned order
		{"7", 0, {7}, {}},
		{"x", -1, {}, {}},
		{"1,x", -1, {}, {}},
		{"1,,y", -1, {}, {}},
	};
	for (const RolesRow &r : rows) {
		std::vector<char> text = buffer(r.text);
		vyr_role_t *const sentinel = reinterpret_cast<vyr_role_t *>(&text);
		vyr_role_t *list = sentinel;
		uint32_t count = 77;
		ASSERT_EQ(vyr_roles_from_text(text.data(), &list, &count), r.result) << '"' << r.text << '"';
		if (r.result != 0) {
			EXPECT_EQ(list, sentinel) << "list written on failure: \"" << r.text << '"';
			EXPECT_EQ(count, 77u);
			continue;
		}
		ASSERT_NE(list, nullptr);
		EXPECT_EQ(ids_of(list, 0, count), r.ids) << '"' << r.text << '"';
		EXPECT_EQ(ids_of(list, count, count + r.behind.size()), r.behind) << '"' << r.text << '"';
		for (uint32_t i = 0; i < count; ++i) {
			EXPECT_EQ(list[i].attr, 0u);
			EXPECT_EQ(list[i].rights, 0u);
		}
		std::free(list);
	}
}

TEST_F(TextIn, RoleListEmptyForms)
{
	ScopedTranslation german(kGerman);
	for (const char *text : {"", "No", "Nein"}) {
		std::vector<char> b = buffer(text);
		vyr_role_t *list = reinterpret_cast<vyr_role_t *>(&b);
		uint32_t count = 5;
		EXPECT_EQ(vyr_roles_from_text(b.data(), &list, &count), 0) << text;
		EXPECT_EQ(list, nullptr) << text;
		EXPECT_EQ(count, 0u) << text;
	}
	vyr_role_t *list = reinterpret_cast<vyr_role_t *>(&list);
	uint32_t count = 5;
	EXPECT_EQ(vyr_roles_from_text(nullptr, &list, &count), 0);
	EXPECT_EQ(list, nullptr);
	EXPECT_EQ(count, 0u);
}

TEST_F(TextIn, RoleListCutsEveryComma)
{
	const char *text = "4,,9,1";
	std::vector<char> b = buffer(text);
	vyr_role_t *list = nullptr;
	uint32_t count = 0;
	ASSERT_EQ(vyr_roles_from_text(b.data(), &list, &count), 0);
	EXPECT_EQ(ids_of(list, 0, count), (std::vector<uint64_t>{9, 4, 1, 0}));
	EXPECT_EQ(b, cut(text, {1, 2, 4}));
	std::free(list);
}

// ---- mandatory parts ---------------------------------------------------------------

struct MlRow {
	const char *text;
	bool ok;
	uint8_t lev, ilev;
	uint64_t cat;
	uint16_t type;
};

void expect_ml(const vyrml_t *ml, const MlRow &r)
{
	ASSERT_NE(ml, nullptr) << '"' << r.text << '"';
	EXPECT_EQ(ml->lev, r.lev) << '"' << r.text << '"';
	EXPECT_EQ(ml->ilev, r.ilev) << '"' << r.text << '"';
	EXPECT_EQ(ml->cat, r.cat) << '"' << r.text << '"';
	EXPECT_EQ(ml->type, r.type) << '"' << r.text << '"';
	EXPECT_EQ(ml->blob_size, 0u);
	EXPECT_EQ(ml->blob, nullptr);
	EXPECT_EQ(vyrml_ucnt(ml), 1);
}

TEST_F(TextIn, MandatoryTable)
{
	const MlRow rows[] = {
		{"5", true, 5, 0, 0, 0},
		{"::", true, 0, 0, 0, 0},
		{":::", true, 0, 0, 0, 0},
		{"1:High", true, 1, 1, 0, 0},
		{"secret:High:alpha,beta:CCNRA", true, 5, 1, 3, 3},
		{"2:High:0x0:0x0", true, 2, 1, 0, 0},
		{"2:1:0x0:0x0", true, 2, 1, 0, 0},
		{":Low:0x0:CCNRA", true, 0, 0, 0, 3},
		{"1:0:0:ccnr,ehole", true, 1, 0, 0, 5},
		{"300:2:face:0x10", true, 44, 2, 0x100, 0x10},
		{"12:3:wide", true, 7, 3, 0x30, 0},
		{"1:0:0:ccnr:x", false, 0, 0, 0, 0},  // further ':' belong to the type
		{"1:2:3:4:5", false, 0, 0, 0, 0},
		{"bogus", false, 0, 0, 0, 0},
		{"1:bogus", false, 0, 0, 0, 0},
		{"1:0:zz", false, 0, 0, 0, 0},
		{"1:0:0:zz", false, 0, 0, 0, 0},
	};
	for (const MlRow &r : rows) {
		vyrml_t *copied = vyrml_get_from_text(r.text);
		std::vector<char> b = buffer(r.text);
		vyrml_t *in_place = vyrml_get_from_text_nc(b.data());
		if (!r.ok) {
			EXPECT_EQ(copied, nullptr) << '"' << r.text << '"';
			EXPECT_EQ(in_place, nullptr) << '"' << r.text << '"';
			continue;
		}
		expect_ml(copied, r);
		expect_ml(in_place, r);
		if (copied)
			vyrml_put(copied);
		if (in_place)
			vyrml_put(in_place);
	}
}

TEST_F(TextIn, MandatoryEmptyIsAFreshZeroPart)
{
	for (vyrml_t *ml : {vyrml_get_from_text(nullptr), vyrml_get_from_text(""),
	                    vyrml_get_from_text_nc(nullptr)}) {
		ASSERT_NE(ml, nullptr);
		EXPECT_NE(ml, VYRL_ZERO->ml);
		EXPECT_EQ(vyrml_cmp(ml, VYRL_ZERO->ml), 1);
		EXPECT_EQ(vyrml_ucnt(ml), 1);
		vyrml_put(ml);
	}
	EXPECT_EQ(vyrml_ucnt(VYRL_ZERO->ml), 1);
}

TEST_F(TextIn, MandatoryInPlaceCutsOnlyTheFieldSeparators)
{
	const char *text = "1:2:alpha,beta:ccnr,ehole:x";
	std::vector<char> b = buffer(text);
	vyrml_t *ml = vyrml_get_from_text_nc(b.data());
	EXPECT_EQ(ml, nullptr);  // "ccnr,ehole:x" is a bad type text
	EXPECT_EQ(b, cut(text, {1, 3, 14}));

	const char *good = "1:2:alpha,beta:ccnr,ehole";
	std::vector<char> g = buffer(good);
	ml = vyrml_get_from_text_nc(g.data());
	ASSERT_NE(ml, nullptr);
	EXPECT_EQ(g, cut(good, {1, 3, 14}));
	vyrml_put(ml);

	const std::vector<char> original = buffer(good);
	std::vector<char> kept = buffer(good);
	ml = vyrml_get_from_text(kept.data());
	ASSERT_NE(ml, nullptr);
	EXPECT_EQ(kept, original);
	vyrml_put(ml);
}

// ---- role parts ------------------------------------------------------------------

struct RlRow {
	const char *text;
	bool ok;
	std::vector<uint64_t> roles1, roles2;
};

void expect_list(const vyr_role_t *roles, uint32_t n, const std::vector<uint64_t> &ids,
                 const char *text)
{
	if (ids.empty()) {
		EXPECT_EQ(roles, nullptr) << '"' << text << '"';
		EXPECT_EQ(n, 0u) << '"' << text << '"';
		return;
	}
	ASSERT_NE(roles, nullptr) << '"' << text << '"';
	EXPECT_EQ(ids_of(roles, 0, n), ids) << '"' << text << '"';
}

TEST_F(TextIn, RolePartTable)
{
	const RlRow rows[] = {
		{"No:No", true, {}, {}},
		{":", true, {}, {}},
		{"No", true, {}, {}},
		{"2,1:No", true, {2, 1}, {}},
		{"2,1:", true, {2, 1}, {}},
		{"2,1", true, {2, 1}, {}},
		{"No:3", true, {}, {3}},
		{":3", true, {}, {3}},
		{"2,1:3", true, {2, 1}, {3}},
		{"1:2:3", true, {1}, {2}},    // "%lu" stops at the second ':'
		{"1,3,2:5,5", true, {3, 2, 1}, {5}},
		{"x:1", false, {}, {}},
		{"1:x", false, {}, {}},
		{"1:2,:No", false, {}, {}},   // ":No" is no number
	};
	for (const RlRow &r : rows) {
		vyrrl_t *copied = vyrrl_get_from_text(r.text);
		std::vector<char> b = buffer(r.text);
		vyrrl_t *in_place = vyrrl_get_from_text_nc(b.data());
		if (!r.ok) {
			EXPECT_EQ(copied, nullptr) << '"' << r.text << '"';
			EXPECT_EQ(in_place, nullptr) << '"' << r.text << '"';
			continue;
		}
		for (vyrrl_t *rl : {copied, in_place}) {
			ASSERT_NE(rl, nullptr) << '"' << r.text << '"';
			expect_list(rl->roles1, rl->nroles1, r.roles1, r.text);
			expect_list(rl->roles2, rl->nroles2, r.roles2, r.text);
			EXPECT_EQ(vyrrl_ucnt(rl), 1);
			vyrrl_put(rl);
		}
	}
}

TEST_F(TextIn, RolePartTranslated)
{
	ScopedTranslation german(kGerman);
	// ":Nein" is ":" and the translated "No", so it reads back as empty.
	for (const char *text : {"Nein:Nein", "Nein", "No:Nein"}) {
		vyrrl_t *rl = vyrrl_get_from_text(text);
		ASSERT_NE(rl, nullptr) << text;
		expect_list(rl->roles1, rl->nroles1, {}, text);
		expect_list(rl->roles2, rl->nroles2, {}, text);
		vyrrl_put(rl);
	}
}

TEST_F(TextIn, RolePartInPlaceCuts)
{
	const char *text = "2,1:3,4:5";
	std::vector<char> b = buffer(text);
	vyrrl_t *rl = vyrrl_get_from_text_nc(b.data());
	ASSERT_NE(rl, nullptr);
	expect_list(rl->roles2, rl->nroles2, {4, 3}, text);
	EXPECT_EQ(b, cut(text, {1, 3, 5}));
	vyrrl_put(rl);
}

// ---- whole labels --------------------------------------------------------------------

struct LabelRow {
	const char *text;
	bool ok;
	uint8_t lev, ilev;
	uint64_t cat;
	uint16_t type;
	std::vector<uint64_t> roles1, roles2;
};

TEST_F(TextIn, LabelTable)
{
	const LabelRow rows[] = {
		{"!", true, 0, 0, 0, 0, {}, {}},
		{"2:High:0x0:0x0!No:No", true, 2, 1, 0, 0, {}, {}},
		{"2:1:0x0:0x0!:", true, 2, 1, 0, 0, {}, {}},
		{":Low:0x0:CCNRA!", true, 0, 0, 0, 3, {}, {}},
		{"secret:Low:alpha,top:ehole!9,5:1", true, 5, 0, 0x8000000000000001ull, 4, {9, 5}, {1}},
		{"topsecret", true, 200, 0, 0, 0, {}, {}},
		{"!3,4", true, 0, 0, 0, 0, {4, 3}, {}},
		{"1!2!3", true, 1, 0, 0, 0, {2}, {}},   // only the first '!' separates
		{"x!1", false, 0, 0, 0, 0, {}, {}},
		{"1:2:3!x", false, 0, 0, 0, 0, {}, {}},
	};
	for (const LabelRow &r : rows) {
		vyrl_t *copied = vyrl_get_from_text(r.text);
		std::vector<char> b = buffer(r.text);
		vyrl_t *in_place = vyrl_get_from_text_nc(b.data());
		if (!r.ok) {
			EXPECT_EQ(copied, nullptr) << '"' << r.text << '"';
			EXPECT_EQ(in_place, nullptr) << '"' << r.text << '"';
			continue;
		}
		for (vyrl_t *l : {copied, in_place}) {
			ASSERT_NE(l, nullptr) << '"' << r.text << '"';
			EXPECT_NE(l, VYRL_ZERO);
			EXPECT_EQ(vyrl_ucnt(l), 1);
			expect_ml(l->ml, {r.text, true, r.lev, r.ilev, r.cat, r.type});
			ASSERT_NE(l->rl, nullptr);
			EXPECT_EQ(vyrrl_ucnt(l->rl), 1);
			expect_list(l->rl->roles1, l->rl->nroles1, r.roles1, r.text);
			expect_list(l->rl->roles2, l->rl->nroles2, r.roles2, r.text);
			vyrl_put(l);
		}
	}
}

TEST_F(TextIn, LabelEmptyIsAFreshZeroLabel)
{
	for (vyrl_t *l : {vyrl_get_from_text(nullptr), vyrl_get_from_text(""),
	                  vyrl_get_from_text_nc(nullptr)}) {
		ASSERT_NE(l, nullptr);
		EXPECT_NE(l, VYRL_ZERO);
		EXPECT_NE(l->ml, VYRL_ZERO->ml);
		EXPECT_NE(l->rl, VYRL_ZERO->rl);
		EXPECT_EQ(vyrl_cmp(l, VYRL_ZERO, 0), 1);
		EXPECT_EQ(vyrl_ucnt(l), 1);
		vyrl_put(l);
	}
	EXPECT_EQ(vyrl_ucnt(VYRL_ZERO), 1);
}

TEST_F(TextIn, LabelInPlaceCutsAlsoOnFailure)
{
	// The role text fails; the '!' and the mandatory separators are cut.
	const char *text = "1:0:alpha,beta!4,x";
	std::vector<char> b = buffer(text);
	EXPECT_EQ(vyrl_get_from_text_nc(b.data()), nullptr);
	EXPECT_EQ(b[1], '\0');
	EXPECT_EQ(b[3], '\0');
	EXPECT_EQ(b[9], ',');     // the cat field is read from a copy
	EXPECT_EQ(b[14], '\0');
	EXPECT_EQ(b[16], '\0');

	const char *good = "1:0:alpha,beta:ccnr,ehole!4,3:2";
	std::vector<char> g = buffer(good);
	vyrl_t *l = vyrl_get_from_text_nc(g.data());
	ASSERT_NE(l, nullptr);
	EXPECT_EQ(g, cut(good, {1, 3, 14, 25, 27, 29}));
	vyrl_put(l);

	std::vector<char> kept = buffer(good);
	l = vyrl_get_from_text(kept.data());
	ASSERT_NE(l, nullptr);
	EXPECT_EQ(kept, buffer(good));
	vyrl_put(l);
}

} // namespace
