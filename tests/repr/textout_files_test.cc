// Label text with names from the real `files` back-end.
#include "repr/textout_support.hh"

#include <vyr/namedb.h>
#include <vyr/text.h>

#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <string>

namespace textout_test {
namespace {

std::string take(char *s)
{
	if (s == nullptr)
		return "<null>";
	std::string r(s);
	std::free(s);
	return r;
}

// Replaces a database file as the back-end's own writers do: a new file
// renamed over the old one.
void write_file(const std::string &path, const std::string &text)
{
	const std::string tmp = path + ".new";
	std::ofstream(tmp) << text;
	ASSERT_EQ(std::rename(tmp.c_str(), path.c_str()), 0);
}

// Every level is named except 2: 0 public, 5 secret, 255 top, lv<N> for the
// others.  Categories: alpha 0x1, beta 0x2, pair 0x6, wide 0x30, eps 0x20,
// then c<N> for each bit N from 6 to 63; bit 3 has no name.
std::string levels_file(const char *name_of_5)
{
	std::string text;
	for (int v = 0; v < 256; ++v) {
		if (v == 2)
			continue;
		const std::string name = v == 0 ? "public" : v == 5 ? name_of_5 : v == 255 ? "top" : "lv" + std::to_string(v);
		text += name + ":" + std::to_string(v) + "\n";
	}
	return text;
}

std::string categories_file()
{
	std::string text = "alpha:1\nbeta:2\npair:6\nwide:30\neps:20\n";
	char line[64];
	for (int bit = 6; bit < 64; ++bit) {
		std::snprintf(line, sizeof line, "c%d:%llx\n", bit, 1ull << bit);
		text += line;
	}
	return text;
}

class TextOutFiles : public ::testing::Test {
protected:
	static void SetUpTestSuite()
	{
		preloaded_ = preload_backend("files");
		dir_ = new std::string(make_temp_dir());
		conf_dir_ = new std::string(configure_databases("files", "files_dir = " + *dir_ + "\n"));
		write_file(*dir_ + "/levels", levels_file("secret"));
		write_file(*dir_ + "/categories", categories_file());
	}
	static void TearDownTestSuite()
	{
		remove_tree(*dir_);
		remove_tree(*conf_dir_);
		delete dir_;
		delete conf_dir_;
	}
	void SetUp() override { ASSERT_TRUE(preloaded_) << "the files back-end did not load"; }
	static inline bool preloaded_ = false;
	static std::string *dir_;
	static std::string *conf_dir_;
};
std::string *TextOutFiles::dir_ = nullptr;
std::string *TextOutFiles::conf_dir_ = nullptr;

struct Case {
	uint8_t lev, ilev;
	uint64_t cat;
	uint16_t type;
	int flags;
	const char *text;
};

TEST_F(TextOutFiles, WholeLabels)
{
	vyr_role_t r1[] = {{2, 0, 0}, {1, 0, 0}}, r2[] = {{3, 0, 0}};
	const Case cases[] = {
		{2, 1, 0, 0, 0, "2:High:0x0:0x0"},
		{5, 0, 0x3, 5, 0, "secret:Low:alpha,beta:ccnr,ehole"},
		{200, 1, 0x9, 7, 0, "lv200:High:alpha,0x8:ALL"},
		{0, 0, 0x6, 3, VYR_TEXT_OMIT_ZERO, ":Low:beta,0x4:CCNRA"},
		{255, 2, 0x30, 0, 0, "top:2:wide:0x0"},
		{255, 2, 0x30, 0, VYR_TEXT_NUMERIC, "255:2:0x30:0x0"},
		{1, 0, ~0ull, 0, 0,
		 "lv1:Low:alpha,beta,wide,c6,c7,c8,c9,c10,c11,c12,c13,c14,c15,c16,c17,c18,c19,c20,c21,c22,c23,"
		 "c24,c25,c26,c27,c28,c29,c30,c31,c32,c33,c34,c35,c36,c37,c38,c39,c40,c41,c42,c43,c44,c45,c46,"
		 "c47,c48,c49,c50,c51,c52,c53,c54,c55,c56,c57,c58,c59,c60,c61,c62,c63,0xc:0x0"},
		{2, 0, 0x1, 0, VYR_TEXT_NAMED_ONLY, "<null>"},
		{1, 0, 0x8, 0, VYR_TEXT_NAMED_ONLY, "<null>"},
	};
	for (const Case &c : cases) {
		vyrml_t ml{};
		ml.lev = c.lev;
		ml.ilev = c.ilev;
		ml.cat = c.cat;
		ml.type = c.type;
		ml.ucnt = 1;
		vyrrl_t rl{2, 1, r1, r2, 1};
		vyrl_t l{&ml, &rl, 1};
		const std::string mandatory = c.text;
		EXPECT_EQ(take(vyrml_get_text(&ml, c.flags)), mandatory);
		const std::string whole = mandatory == "<null>" ? mandatory : mandatory + "!2,1:3";
		EXPECT_EQ(take(vyrl_get_text(&l, c.flags)), whole);
	}
}

TEST_F(TextOutFiles, LevelForms)
{
	EXPECT_EQ(take(vyr_lev_get_text(5, 0)), "secret");
	EXPECT_EQ(take(vyr_lev_get_text(2, 0)), "<null>");
	EXPECT_EQ(take(vyr_lev_get_text(2, VYR_TEXT_NAMED_ONLY)), "2");
	EXPECT_EQ(take(vyr_cat_get_text(0x8000000000000001ull, 0)), "alpha,c63");
}

// The library keeps no names: a renamed level shows in the very next text.
TEST_F(TextOutFiles, NamesAreLookedUpAtEveryCall)
{
	EXPECT_EQ(take(vyr_lev_get_text(5, 0)), "secret");
	write_file(*dir_ + "/levels", levels_file("hidden"));
	EXPECT_EQ(take(vyr_lev_get_text(5, 0)), "hidden");
	write_file(*dir_ + "/levels", levels_file("secret"));
	EXPECT_EQ(take(vyr_lev_get_text(5, 0)), "secret");
}

} // namespace
} // namespace textout_test
