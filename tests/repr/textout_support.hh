// Shared pieces of the text writer tests: a test translation of the fixed
// words, the database configuration, and an obstack for the writers.
#pragma once

#include <cstdint>
#include <obstack.h>
#include <string>

#include "repr/textout_guard.hh"

namespace textout_test {

// The fixed words as the test translation gives them.  ":No" is translated
// with a different separator on purpose: it must be a message of its own.
struct Words {
	const char *low;
	const char *high;
	const char *no;
	const char *colon_no;
};
inline constexpr Words kFrench = {"Bas", "Haut", "Aucun", "|aucun"};

// The interposed dcgettext translates only domain "vyr", category
// LC_MESSAGES, and counts every lookup it is asked for.
void set_translation(const Words *words);
long translation_lookups();
// Whether any lookup came with another domain or category.
bool foreign_lookup_seen();

class ScopedTranslation {
public:
	explicit ScopedTranslation(const Words &w) { set_translation(&w); }
	~ScopedTranslation() { set_translation(nullptr); }
	ScopedTranslation(const ScopedTranslation &) = delete;
	ScopedTranslation &operator=(const ScopedTranslation &) = delete;
};

// A new empty directory below $TMPDIR (or /tmp).
std::string make_temp_dir();

// Writes a database configuration naming `backend` for the level and
// category databases, in the locale's own charset, into a new directory and
// points VYR_DBROUTE_CONF at it.  `extra` is appended as it stands.  Returns
// the directory; the file is read only when the databases start, so it can
// go once they have.
std::string configure_databases(const std::string &backend, const std::string &extra = "");

// Loads the back-end plug-in `backend` from the build's library directory
// (VYR_TEST_BUILD_DIR/lib) ahead of the name databases, which then find it
// loaded under its file name.  Under the sanitizers their own dlopen search
// misses the directory beside libvyr.so.2.  Returns false if it won't load.
bool preload_backend(const std::string &backend);

// Removes a directory and everything below it.
void remove_tree(const std::string &dir);

// A caller's obstack for the writers.
class Obstack {
public:
	Obstack();
	~Obstack();
	Obstack(const Obstack &) = delete;
	Obstack &operator=(const Obstack &) = delete;

	struct obstack *get() { return &o_; }
	// The object being built, as it stands (the writers never terminate it).
	std::string text() const;

private:
	struct obstack o_;
};

} // namespace textout_test
