// Shared harness of the label text tests: the names every back-end under test
// serves, a test translation of the fixed words, a caller's obstack, and the
// fixture that starts the databases.
#pragma once

#include <vyr/label.h>
#include <vyr/text.h>

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <initializer_list>
#include <obstack.h>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace text_test {

struct LevelName {
	const char *name;
	uint8_t value;
};
struct CategoryName {
	const char *name;
	uint64_t value;
};

// Level 2 has no name, and "12" names level 7, so the number 12 can't be
// read as a level.
inline constexpr LevelName kLevels[] = {{"public", 0}, {"secret", 5}, {"12", 7}, {"top", 255}};

// In walk order. "pair" loses bit 0x2 to the earlier "beta", "wide" (two
// bits) comes before "eps", "face" is a name that also spells a number, and
// nothing is named 0x8 or 0x0.
inline constexpr CategoryName kCategories[] = {{"alpha", 0x1}, {"beta", 0x2}, {"pair", 0x6},
                                              {"wide", 0x30}, {"eps", 0x20}, {"face", 0x100}};

// The fixed words as the test translation gives them; a nullptr stays
// untranslated. Only the domain "vyr" in LC_MESSAGES is translated.
struct Words {
	const char *low, *high, *no, *colon_no;
};
// ":No" is ":" and "No" translated, so an empty second list reads back.
inline constexpr Words kGerman = {"Niedrig", "Hoch", "Nein", ":Nein"};

void set_translation(const Words *words);
long translation_lookups();
bool foreign_lookup_seen();  // a lookup in another domain or category

class ScopedTranslation {
public:
	explicit ScopedTranslation(const Words &w) { set_translation(&w); }
	~ScopedTranslation() { set_translation(nullptr); }
	ScopedTranslation(const ScopedTranslation &) = delete;
	ScopedTranslation &operator=(const ScopedTranslation &) = delete;
};

// The directory that holds the files back-end's database files.
const std::string &files_dir();
// Writes the level file of the files back-end, with `name_of_5` for level 5.
void write_levels_file(const char *name_of_5);

// Starts the program's back-end once (outside any allocation counting: the
// first call of a database loads its plug-in for good) and, with the
// in-memory back-end, loads the names again and clears its counters.
class TextTest : public ::testing::Test {
protected:
	void SetUp() override;
	void TearDown() override { set_translation(nullptr); }
};

// A caller's obstack for the writers.
class Obstack {
public:
	Obstack();
	~Obstack() { obstack_free(&o_, nullptr); }
	Obstack(const Obstack &) = delete;
	Obstack &operator=(const Obstack &) = delete;
	struct obstack *get() { return &o_; }
	// The object being built, as it stands (the writers never terminate it).
	std::string text();

private:
	struct obstack o_;
};

// Takes over a string from the library; "<null>" stands for NULL.
inline std::string take(char *s)
{
	std::string r = s != nullptr ? s : "<null>";
	std::free(s);
	return r;
}

// A writable copy of a text, NUL included, for the in-place readers; NULL
// gives an empty buffer, which chars() turns back into NULL.
inline std::vector<char> buffer(const char *text)
{
	return text ? std::vector<char>(text, text + std::strlen(text) + 1) : std::vector<char>{};
}
inline char *chars(std::vector<char> &b) { return b.empty() ? nullptr : b.data(); }

// A label on the stack, roles without attr and rights: the writers only read.
struct StackLabel {
	vyrml_t ml{};
	vyrrl_t rl{};
	vyrl_t l{&ml, &rl, 1};
	std::vector<vyr_role_t> r1, r2;

	StackLabel(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type,
	           std::initializer_list<uint64_t> ids1 = {}, std::initializer_list<uint64_t> ids2 = {})
	{
		ml.lev = lev;
		ml.ilev = ilev;
		ml.cat = cat;
		ml.type = type;
		ml.ucnt = 1;
		set_roles(ids1, ids2);
	}
	void set_roles(std::initializer_list<uint64_t> ids1, std::initializer_list<uint64_t> ids2)
	{
		r1.clear();
		r2.clear();
		for (uint64_t id : ids1)
			r1.push_back({id, 0, 0});
		for (uint64_t id : ids2)
			r2.push_back({id, 0, 0});
		rl = vyrrl_t{static_cast<uint32_t>(r1.size()), static_cast<uint32_t>(r2.size()),
		             r1.empty() ? nullptr : r1.data(), r2.empty() ? nullptr : r2.data(), 1};
	}
	StackLabel(const StackLabel &) = delete;
	StackLabel &operator=(const StackLabel &) = delete;
};

} // namespace text_test
