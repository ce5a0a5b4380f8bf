// Text written by the writers reads back: random labels go out as text under
// each flag word and come back equal in every field that survives the trip.
// What doesn't survive is spelled out in expected_back(): attr, rights and
// the blob are lost, a type that mixes bit names with a remainder keeps only
// the remainder, and a number that is also a level name reads as that name.
#include <vyr/label.h>
#include <vyr/text.h>

#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "repr/textin_support.hh"

namespace {

using namespace textin_test;

class TextInRoundTrip : public ::testing::Test {
protected:
	static void SetUpTestSuite() { start_databases(); }
};

struct Fields {
	uint8_t lev, ilev;
	uint64_t cat;
	uint16_t type;
	std::vector<vyr_role_t> roles1, roles2;
};

uint8_t random_level(std::mt19937_64 &rng)
{
	// Mostly the named levels and their neighbours, sometimes anything.
	if (rng() % 2 != 0)
		return static_cast<uint8_t>(rng());
	const LevelName &l = kLevels[rng() % std::size(kLevels)];
	return static_cast<uint8_t>(l.value + static_cast<int>(rng() % 3) - 1);
}

uint64_t random_categories(std::mt19937_64 &rng)
{
	uint64_t cat = 0;
	switch (rng() % 3) {
	case 0:
		return rng();
	case 1:
		for (const CategoryName &c : kCategories)
			if (rng() % 2 != 0)
				cat |= c.value;
		return cat | (rng() % 2 != 0 ? 1ull << (rng() % 64) : 0);
	default:
		return rng() % 4 == 0 ? 0 : 1ull << (rng() % 64);
	}
}

uint16_t random_type(std::mt19937_64 &rng)
{
	switch (rng() % 3) {
	case 0:
		return static_cast<uint16_t>(rng());
	case 1:
		return static_cast<uint16_t>(rng() % 8);
	default:
		return static_cast<uint16_t>((rng() % 8) | ((rng() % 4) << 3));
	}
}

std::vector<vyr_role_t> random_roles(std::mt19937_64 &rng)
{
	std::vector<vyr_role_t> roles(rng() % 6);
	for (vyr_role_t &r : roles) {
		switch (rng() % 4) {
		case 0: r.id = rng() % 4; break;          // small, with duplicates
		case 1: r.id = ~0ull - rng() % 2; break;  // prints as a negative number
		default: r.id = rng(); break;
		}
		r.attr = static_cast<uint32_t>(rng());
		r.rights = static_cast<uint8_t>(rng());
	}
	return roles;
}

Fields random_fields(std::mt19937_64 &rng)
{
	return {random_level(rng), static_cast<uint8_t>(rng() % 3 == 0 ? rng() : rng() % 2),
	        random_categories(rng), random_type(rng), random_roles(rng), random_roles(rng)};
}

vyrl_t *make_label(const Fields &f)
{
	return vyrl_get_new_init_mac_roles(f.lev, f.ilev, f.cat, f.type, f.roles1.data(),
	                                   static_cast<uint32_t>(f.roles1.size()), f.roles2.data(),
	                                   static_cast<uint32_t>(f.roles2.size()));
}

// The label that reading back must give for a label of these fields written
// under `flags`.
vyrl_t *expected_back(Fields f, int flags, bool names)
{
	if (names) {
		const std::string number = std::to_string(f.lev);
		for (const LevelName &l : kLevels)
			if (number == l.name)
				f.lev = l.value;
	}
	const bool numeric = (flags & VYR_TEXT_NUMERIC) != 0;
	const bool composite = f.type == 3 || f.type == 7;
	if (!numeric && !composite && (f.type & 7) != 0 && (f.type & ~7) != 0)
		f.type = static_cast<uint16_t>(f.type & ~7);
	for (auto *list : {&f.roles1, &f.roles2})
		for (vyr_role_t &r : *list)
			r.attr = r.rights = 0;
	return make_label(f);
}

std::string describe(const vyrl_t *l)
{
	char *text = vyrl_get_text(l, VYR_TEXT_NUMERIC);
	std::string s = text ? text : "(no text)";
	std::free(text);
	return s;
}

void round_trip(int flags, int labels, uint64_t seed)
{
	std::mt19937_64 rng(seed);
	for (int i = 0; i < labels; ++i) {
		const Fields f = random_fields(rng);
		vyrl_t *label = make_label(f);
		ASSERT_NE(label, nullptr);
		// A blob goes along to show that it is simply dropped.
		if (i % 3 == 0) {
			label->ml->blob = static_cast<unsigned char *>(std::malloc(4));
			ASSERT_NE(label->ml->blob, nullptr);
			std::memcpy(label->ml->blob, "blob", 4);
			label->ml->blob_size = 4;
		}
		char *text = vyrl_get_text(label, flags);
		ASSERT_NE(text, nullptr) << "writer failed on " << describe(label);
		vyrl_t *expected = expected_back(f, flags, backend().has_names);
		ASSERT_NE(expected, nullptr);

		vyrl_t *copied = vyrl_get_from_text(text);
		ASSERT_NE(copied, nullptr) << "flags " << flags << ": \"" << text << '"';
		EXPECT_EQ(vyrl_cmp(copied, expected, 0), 1)
			<< "flags " << flags << ": \"" << text << "\" read back as " << describe(copied)
			<< ", expected " << describe(expected);

		std::vector<char> b(text, text + std::strlen(text) + 1);
		vyrl_t *in_place = vyrl_get_from_text_nc(b.data());
		ASSERT_NE(in_place, nullptr) << "flags " << flags << ": \"" << text << '"';
		EXPECT_EQ(vyrl_cmp(in_place, expected, 0), 1) << "flags " << flags << ": \"" << text << '"';

		vyrl_put(in_place);
		vyrl_put(copied);
		vyrl_put(expected);
		std::free(text);
		vyrl_put(label);
	}
}

TEST_F(TextInRoundTrip, NamedText)
{
	round_trip(0, 400, 1);
}

TEST_F(TextInRoundTrip, NumericText)
{
	round_trip(VYR_TEXT_NUMERIC, 400, 2);
}

TEST_F(TextInRoundTrip, OmittedZeros)
{
	round_trip(VYR_TEXT_OMIT_ZERO, 200, 3);
	round_trip(VYR_TEXT_OMIT_ZERO | VYR_TEXT_NUMERIC, 200, 4);
}

TEST_F(TextInRoundTrip, TranslatedWords)
{
	ScopedTranslation german(kGerman);
	round_trip(0, 200, 5);
}

// The fixed words of the field parts read back through single-field writers.
TEST_F(TextInRoundTrip, SingleFields)
{
	std::mt19937_64 rng(6);
	for (int i = 0; i < 300; ++i) {
		const uint64_t cat = random_categories(rng);
		char *text = vyr_cat_get_text(cat, i % 2 ? VYR_TEXT_NUMERIC : 0);
		ASSERT_NE(text, nullptr);
		uint64_t back = 0;
		EXPECT_EQ(vyr_cat_from_text(text, &back), 0) << text;
		EXPECT_EQ(back, cat) << text;
		std::free(text);

		const uint16_t type = random_type(rng);
		text = vyr_type_get_text(type, VYR_TEXT_NUMERIC);
		ASSERT_NE(text, nullptr);
		uint16_t tback = 0;
		EXPECT_EQ(vyr_type_from_text(text, &tback), 0) << text;
		EXPECT_EQ(tback, type) << text;
		std::free(text);
	}
}

TEST_F(TextInRoundTrip, IntegrityWordOfAnotherLanguageIsRefused)
{
	char *text = nullptr;
	{
		ScopedTranslation german(kGerman);
		vyrl_t *label = vyrl_get_new_init_mac(2, 1, 0, 0);
		ASSERT_NE(label, nullptr);
		text = vyrl_get_text(label, 0);
		vyrl_put(label);
	}
	ASSERT_NE(text, nullptr);
	const Words french = {"Bas", "Haut", "Non", ":Non"};
	ScopedTranslation t(french);
	errno = 0;
	EXPECT_EQ(vyrl_get_from_text(text), nullptr) << text;
	EXPECT_EQ(errno, EINVAL) << text;
	std::free(text);
}

TEST_F(TextInRoundTrip, EmptyRoleListsNeedAColonInTheTranslation)
{
	// ":No" translated as something other than ':' and the translated "No"
	// doesn't read back as an empty second list.
	const Words odd = {nullptr, nullptr, "Nein", "/Nein"};
	ScopedTranslation t(odd);
	vyrl_t *label = vyrl_get_new_init_mac(2, 0, 0, 0);
	ASSERT_NE(label, nullptr);
	char *text = vyrl_get_text(label, 0);
	ASSERT_NE(text, nullptr);
	EXPECT_EQ(vyrl_get_from_text(text), nullptr) << text;
	std::free(text);
	vyrl_put(label);
}

} // namespace
