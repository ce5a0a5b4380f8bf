// Text written by the writers reads back: random labels go out as text under
// each flag word and come back equal in every field that survives the trip.
// What doesn't survive is spelled out in expected_back(). Runs against the
// in-memory back-end and, end to end, against the real `files` back-end.
#include "repr/text_support.hh"

#include <cerrno>
#include <random>

namespace text_test {
namespace {

using TextRoundTrip = TextTest;

struct Fields {
	uint8_t lev, ilev;
	uint64_t cat;
	uint16_t type;
	std::vector<vyr_role_t> roles1, roles2;
};

// Mostly values that have names and their neighbours, sometimes anything.
Fields random_fields(std::mt19937_64 &rng)
{
	Fields f{};
	f.lev = static_cast<uint8_t>(rng() % 2 ? rng() : kLevels[rng() % std::size(kLevels)].value + rng() % 3 - 1);
	f.ilev = static_cast<uint8_t>(rng() % 3 == 0 ? rng() : rng() % 2);
	if (rng() % 2) {
		for (const CategoryName &c : kCategories)
			f.cat |= rng() % 2 ? c.value : 0;
		f.cat |= rng() % 2 ? 1ull << (rng() % 64) : 0;
	} else {
		f.cat = rng() % 4 == 0 ? 0 : rng();
	}
	f.type = static_cast<uint16_t>(rng() % 2 ? rng() : rng() % 32);
	for (auto *list : {&f.roles1, &f.roles2}) {
		list->resize(rng() % 6);
		for (vyr_role_t &r : *list) {
			const uint64_t kind = rng() % 4;  // small with duplicates, negative as text, or anything
			r = {kind == 0 ? rng() % 4 : kind == 1 ? ~0ull - rng() % 2 : rng(), static_cast<uint32_t>(rng()),
			     static_cast<uint8_t>(rng())};
		}
	}
	return f;
}

vyrl_t *make_label(const Fields &f)
{
	return vyrl_get_new_init_mac_roles(f.lev, f.ilev, f.cat, f.type, f.roles1.data(),
	                                   static_cast<uint32_t>(f.roles1.size()), f.roles2.data(),
	                                   static_cast<uint32_t>(f.roles2.size()));
}

// A level number that is also a level name reads as that name; a type that
// mixes bit names with a remainder keeps only the remainder; attr and rights
// are lost, and so is the blob.
vyrl_t *expected_back(Fields f, int flags)
{
	for (const LevelName &l : kLevels)
		if (std::to_string(f.lev) == l.name)
			f.lev = l.value;
	const bool composite = f.type == 3 || f.type == 7;
	if (!(flags & VYR_TEXT_NUMERIC) && !composite && (f.type & 7) != 0 && (f.type & ~7) != 0)
		f.type &= ~7;
	for (auto *list : {&f.roles1, &f.roles2})
		for (vyr_role_t &r : *list)
			r.attr = r.rights = 0;
	return make_label(f);
}

void round_trip(int flags, int labels, uint64_t seed)
{
	std::mt19937_64 rng(seed);
	for (int i = 0; i < labels; ++i) {
		const Fields f = random_fields(rng);
		vyrl_t *label = make_label(f);
		ASSERT_NE(label, nullptr);
		if (i % 3 == 0) {  // a blob goes along to show that it is dropped
			label->ml->blob = static_cast<unsigned char *>(std::malloc(4));
			std::memcpy(label->ml->blob, "blob", 4);
			label->ml->blob_size = 4;
		}
		vyrl_t *expected = expected_back(f, flags);
		const std::string text = take(vyrl_get_text(label, flags));
		SCOPED_TRACE(testing::Message() << "flags " << flags << ": \"" << text << "\", expected "
		                                << take(vyrl_get_text(expected, VYR_TEXT_NUMERIC)));
		vyrl_t *copied = vyrl_get_from_text(text.c_str());
		std::vector<char> b = buffer(text.c_str());
		vyrl_t *in_place = vyrl_get_from_text_nc(b.data());
		ASSERT_TRUE(copied && in_place);
		EXPECT_EQ(vyrl_cmp(copied, expected, 0), 1) << take(vyrl_get_text(copied, VYR_TEXT_NUMERIC));
		EXPECT_EQ(vyrl_cmp(in_place, expected, 0), 1);
		for (vyrl_t *l : {label, expected, copied, in_place})
			vyrl_put(l);
	}
}

TEST_F(TextRoundTrip, EveryFlagWord)
{
	round_trip(0, 400, 1);
	round_trip(VYR_TEXT_NUMERIC, 300, 2);
	round_trip(VYR_TEXT_OMIT_ZERO, 200, 3);
	round_trip(VYR_TEXT_OMIT_ZERO | VYR_TEXT_NUMERIC, 200, 4);
	ScopedTranslation german(kGerman);
	round_trip(0, 200, 5);
}

// An integrity word written in one language is refused in another, and a
// translation of ":No" that isn't ":" and the translated "No" doesn't read
// back as an empty list.
TEST_F(TextRoundTrip, TranslationsThatDontComeBack)
{
	vyrl_t *label = vyrl_get_new_init_mac(2, 1, 0, 0);
	std::string text;
	{
		ScopedTranslation german(kGerman);
		text = take(vyrl_get_text(label, 0));
	}
	static constexpr Words kFrench = {"Bas", "Haut", "Non", "/Non"};
	ScopedTranslation french(kFrench);
	errno = 0;
	EXPECT_EQ(vyrl_get_from_text(text.c_str()), nullptr) << text;
	EXPECT_EQ(errno, EINVAL);
	label->ml->ilev = 0;
	text = take(vyrl_get_text(label, 0));
	EXPECT_EQ(text, "2:Bas:0x0:0x0!Non/Non");
	EXPECT_EQ(vyrl_get_from_text(text.c_str()), nullptr);
	vyrl_put(label);
}

#ifdef TEXT_TEST_FILES
// The library keeps no names: a renamed level shows in the very next text,
// both ways.
TEST_F(TextRoundTrip, NamesAreLookedUpAtEveryCall)
{
	uint8_t lev = 0;
	EXPECT_EQ(take(vyr_lev_get_text(5, 0)), "secret");
	write_levels_file("hidden");
	EXPECT_EQ(take(vyr_lev_get_text(5, 0)), "hidden");
	EXPECT_EQ(vyr_lev_from_text("hidden", &lev), 0);
	EXPECT_EQ(lev, 5);
	EXPECT_EQ(vyr_lev_from_text("secret", &lev), -1);
	write_levels_file("secret");
	EXPECT_EQ(take(vyr_lev_get_text(5, 0)), "secret");
}
#endif

} // namespace
} // namespace text_test
