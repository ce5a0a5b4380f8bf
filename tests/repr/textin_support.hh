// Shared pieces of the text reader tests: the names every back-end under test
// serves, a test translation of the fixed words, and the database set-up.
#pragma once

#include <cstdint>
#include <string>

namespace textin_test {

struct LevelName {
	const char *name;
	uint8_t value;
};

struct CategoryName {
	const char *name;
	uint64_t value;
};

// "12" names level 7, so the number 12 can't be read as a level while it is
// there; "face" names a bit that the number 0xface doesn't have; "wide" holds
// two bits.
inline constexpr LevelName kLevels[] = {
	{"unclassified", 1},
	{"secret", 5},
	{"topsecret", 200},
	{"12", 7},
};

inline constexpr CategoryName kCategories[] = {
	{"alpha", 0x1},
	{"beta", 0x2},
	{"face", 0x100},
	{"wide", 0x30},
	{"top", 0x8000000000000000ull},
};

// The fixed words as the test translation gives them; nullptr members stay
// untranslated. The interposed dcgettext translates only messages of the
// domain "vyr" in the category LC_MESSAGES.
struct Words {
	const char *low;
	const char *high;
	const char *no;
	const char *colon_no;
};

inline constexpr Words kGerman = {"Niedrig", "Hoch", "Nein", ":Nein"};

void set_translation(const Words *words);

// Sets the translation for the lifetime of one scope.
class ScopedTranslation {
public:
	explicit ScopedTranslation(const Words &words) { set_translation(&words); }
	~ScopedTranslation() { set_translation(nullptr); }
	ScopedTranslation(const ScopedTranslation &) = delete;
	ScopedTranslation &operator=(const ScopedTranslation &) = delete;
};

// A new empty directory below $TMPDIR (or /tmp).
std::string make_temp_dir();

// Points the database configuration at a file naming `backend` for the level
// and category databases, with the locale's own charset so that no name is
// converted. `extra` is appended verbatim (e.g. "files_dir = ...\n").
void configure_databases(const std::string &backend, const std::string &extra = "");

// What the test program's back-end provides; defined once per program by the
// back-end set-up it links (memory, files or none).
struct Backend {
	const char *name;
	bool has_names;     // serves kLevels and kCategories
	bool counts_calls;  // textinmem statistics are available
};
const Backend &backend();

// Starts the configured back-end once per process, outside any allocation
// tracking: the first use of a database loads its plug-in and keeps that
// state for the life of the process.
void start_databases();

} // namespace textin_test
