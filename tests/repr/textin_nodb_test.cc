// The readers with no back-end configured for either database: every open
// fails, and texts are read as numbers only.
#include <vyr/label.h>
#include <vyr/text.h>

#include <cstdint>

#include <gtest/gtest.h>

#include "repr/textin_support.hh"

namespace {

using namespace textin_test;

class TextInNoDb : public ::testing::Test {
protected:
	static void SetUpTestSuite() { start_databases(); }
};

TEST_F(TextInNoDb, LevelsAreNumbersOnly)
{
	uint8_t lev = 0;
	EXPECT_EQ(vyr_lev_from_text("12", &lev), 0);
	EXPECT_EQ(lev, 12);
	lev = 0xaa;
	EXPECT_EQ(vyr_lev_from_text("secret", &lev), -1);
	EXPECT_EQ(lev, 0xaa);
}

TEST_F(TextInNoDb, CategoriesAreHexadecimalOnly)
{
	uint64_t cat = 0;
	EXPECT_EQ(vyr_cat_from_text("face,0x10000", &cat), 0);
	EXPECT_EQ(cat, 0x1faceu);
	EXPECT_EQ(vyr_cat_from_text("alpha", &cat), -1);
	EXPECT_EQ(cat, 0u);
}

TEST_F(TextInNoDb, WholeLabelsStillRead)
{
	vyrl_t *l = vyrl_get_from_text("7:High:0x5:ccnr!3,9:No");
	ASSERT_NE(l, nullptr);
	EXPECT_EQ(l->ml->lev, 7);
	EXPECT_EQ(l->ml->ilev, 1);
	EXPECT_EQ(l->ml->cat, 5u);
	EXPECT_EQ(l->ml->type, 1);
	ASSERT_EQ(l->rl->nroles1, 2u);
	EXPECT_EQ(l->rl->roles1[0].id, 9u);
	EXPECT_EQ(l->rl->roles1[1].id, 3u);
	EXPECT_EQ(l->rl->nroles2, 0u);
	vyrl_put(l);
	EXPECT_EQ(vyrl_get_from_text("secret:High:0x5:ccnr!"), nullptr);
	EXPECT_EQ(vyrl_get_from_text("7:High:alpha:ccnr!"), nullptr);
}

} // namespace
