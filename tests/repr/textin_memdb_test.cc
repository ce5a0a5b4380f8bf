// How much database work the readers do, and how they carry on when a
// database can't be opened. Uses the counters of the in-memory back-end.
#include <vyr/label.h>
#include <vyr/text.h>

#include <cstdint>
#include <cstring>
#include <vector>

#include <gtest/gtest.h>

#include "repr/textin_memdb.h"
#include "repr/textin_support.hh"

namespace {

using namespace textin_test;

class TextInDbWork : public ::testing::Test {
protected:
	static void SetUpTestSuite() { start_databases(); }
	void SetUp() override { textinmem_clear_stats(); }
	void TearDown() override { textinmem_set_open_ok(true, true); }
};

void expect_balanced(const textinmem_stats &s)
{
	EXPECT_EQ(s.lev_opens, s.lev_closes) << "every level database open is closed";
	EXPECT_EQ(s.cat_opens, s.cat_closes) << "every category database open is closed";
}

TEST_F(TextInDbWork, EmptyTextsTouchNoDatabase)
{
	uint8_t lev = 1;
	uint64_t cat = 1;
	EXPECT_EQ(vyr_lev_from_text("", &lev), 0);
	EXPECT_EQ(vyr_lev_from_text(nullptr, &lev), 0);
	EXPECT_EQ(vyr_cat_from_text("", &cat), 0);
	EXPECT_EQ(vyr_cat_from_text(nullptr, &cat), 0);
	char empty[] = "";
	EXPECT_EQ(vyr_cat_from_text_nc(empty, &cat), 0);
	vyrl_t *l = vyrl_get_from_text("");
	ASSERT_NE(l, nullptr);
	vyrl_put(l);
	const textinmem_stats s = textinmem_get_stats();
	EXPECT_EQ(s.lev_opens, 0);
	EXPECT_EQ(s.cat_opens, 0);
}

TEST_F(TextInDbWork, FieldsWithoutNamesOpenNoDatabase)
{
	uint8_t ilev = 0;
	uint16_t type = 0;
	vyr_role_t role{};
	EXPECT_EQ(vyr_ilev_from_text("High", &ilev), 0);
	EXPECT_EQ(vyr_ilev_from_text("secret", &ilev), -1);
	EXPECT_EQ(vyr_type_from_text("ccnr,alpha", &type), -1);
	EXPECT_EQ(vyr_role_from_text(&role, "secret"), -1);
	vyrrl_t *rl = vyrrl_get_from_text("3,2:1");
	ASSERT_NE(rl, nullptr);
	vyrrl_put(rl);
	const textinmem_stats s = textinmem_get_stats();
	EXPECT_EQ(s.lev_opens + s.cat_opens, 0);
}

TEST_F(TextInDbWork, WholeLabelCostsOneOpenEachAndOneLookupPerToken)
{
	vyrl_t *l = vyrl_get_from_text("secret:High:alpha,,beta,0x8,face:ehole!2:1");
	ASSERT_NE(l, nullptr);
	EXPECT_EQ(l->ml->cat, 0x10bu);
	vyrl_put(l);
	const textinmem_stats s = textinmem_get_stats();
	EXPECT_EQ(s.lev_opens, 1);
	EXPECT_EQ(s.lev_lookups, 1);
	EXPECT_EQ(s.cat_opens, 1);
	EXPECT_EQ(s.cat_lookups, 4);  // the empty token between the commas is no token
	expect_balanced(s);
}

TEST_F(TextInDbWork, FailuresCloseWhatTheyOpened)
{
	uint64_t cat = 0;
	EXPECT_EQ(vyr_cat_from_text("alpha,zz,beta", &cat), -1);
	uint8_t lev = 0;
	EXPECT_EQ(vyr_lev_from_text("nosuchlevel", &lev), -1);
	EXPECT_EQ(vyrl_get_from_text("secret:Low:alpha:bogus!"), nullptr);
	const textinmem_stats s = textinmem_get_stats();
	EXPECT_EQ(s.cat_lookups, 3);  // the reader stops at the bad token
	EXPECT_EQ(s.lev_opens, 2);
	expect_balanced(s);
}

// Without a level database a level is still read as a number; without a
// category database each token reads as a hexadecimal number.
struct NoDbRow {
	const char *text;
	bool lev_ok;
	uint8_t lev;
	bool cat_ok;
	uint64_t cat;
};

TEST_F(TextInDbWork, UnavailableDatabasesLeaveTheNumbers)
{
	textinmem_set_open_ok(false, false);
	const NoDbRow rows[] = {
		{"12", true, 12, true, 0x12},
		{"face", false, 0, true, 0xface},
		{"secret", false, 0, false, 0},
		{"alpha", false, 0, false, 0},
		{"a,b", false, 0, true, 0xb},
	};
	for (const NoDbRow &r : rows) {
		uint8_t lev = 0xaa;
		uint64_t cat = 0x5555;
		EXPECT_EQ(vyr_lev_from_text(r.text, &lev), r.lev_ok ? 0 : -1) << r.text;
		if (r.lev_ok) {
			EXPECT_EQ(lev, r.lev) << r.text;
		}
		EXPECT_EQ(vyr_cat_from_text(r.text, &cat), r.cat_ok ? 0 : -1) << r.text;
		if (r.cat_ok) {
			EXPECT_EQ(cat, r.cat) << r.text;
		}
	}
	const textinmem_stats s = textinmem_get_stats();
	EXPECT_EQ(s.lev_lookups + s.cat_lookups, 0);
}

TEST_F(TextInDbWork, NameLookupSeesTheWholeToken)
{
	// Separators cut names: a name never reaches the database with its
	// neighbours attached, and blanks are part of the token.
	uint64_t cat = 0;
	EXPECT_EQ(vyr_cat_from_text(" alpha", &cat), -1);
	EXPECT_EQ(vyr_cat_from_text("alpha ", &cat), -1);
	EXPECT_EQ(vyr_cat_from_text("alpha,wide", &cat), 0);
	EXPECT_EQ(cat, 0x31u);
}

} // namespace
