#include "repr/text_support.hh"

#include <vyr/namedb.h>

#include "support/scratch_dir.hh"

#include <clocale>
#include <fstream>
#include <langinfo.h>
#include <libintl.h>
#include <string_view>

#ifndef TEXT_TEST_FILES
#include "support/memdb/textmem.h"
#endif

namespace text_test {
namespace {

const Words *g_words = nullptr;
long g_lookups = 0;
bool g_foreign = false;

void *chunk_malloc(long n) { return std::malloc(static_cast<size_t>(n)); }

// Points the databases at `backend`, in the locale's own charset so that no
// name is converted on its way.
void configure_databases(const char *backend, const std::string &extra)
{
	static const vyr_test::ScratchDir dir;  // read only when the databases start
	const std::string conf = dir / "dbroute.conf";
	const char *charset = nl_langinfo(CODESET);
	std::ofstream(conf) << "lev_backend = " << backend << "\nlev_charset = " << charset
	                    << "\ncat_backend = " << backend << "\ncat_charset = " << charset << "\n"
	                    << extra;
	setenv("VYR_DBROUTE_CONF", conf.c_str(), 1);
}

// Writes the names where the program's back-end serves them from.
void load_names()
{
#ifdef TEXT_TEST_FILES
	static const bool configured = [] {
		write_levels_file("secret");
		std::ofstream cats(files_dir() + "/categories");
		for (const CategoryName &c : kCategories)
			cats << c.name << ':' << std::hex << c.value << '\n';
		configure_databases("files", "files_dir = " + files_dir() + "\n");
		return true;
	}();
#else
	static const bool configured = (configure_databases("textmem", ""), true);
	textmem_reset();
	for (const LevelName &l : kLevels)
		textmem_add_level(l.name, l.value);
	for (const CategoryName &c : kCategories)
		textmem_add_category(c.name, c.value);
#endif
	(void)configured;
}

// The first call of each database loads its plug-in for good; that must not
// happen while a test counts allocations. Returns whether both started.
bool start_databases()
{
	static const bool started = [] {
		load_names();
		void *lev = openlevdb_r();
		void *cat = opencatdb_r();
		if (lev != nullptr)
			closelevdb_r(lev);
		if (cat != nullptr)
			closecatdb_r(cat);
		return lev != nullptr && cat != nullptr;
	}();
	return started;
}

} // namespace

void set_translation(const Words *words) { g_words = words; }
long translation_lookups() { return g_lookups; }
bool foreign_lookup_seen() { return g_foreign; }

const std::string &files_dir()
{
	static const vyr_test::ScratchDir dir;
	return dir.path();
}

// Replaced as the back-end's own writers do: a new file renamed over the old.
void write_levels_file(const char *name_of_5)
{
	const std::string path = files_dir() + "/levels";
	std::ofstream out(path + ".new");
	for (const LevelName &l : kLevels)
		out << (l.value == 5 ? name_of_5 : l.name) << ':' << unsigned{l.value} << '\n';
	out.close();
	ASSERT_EQ(std::rename((path + ".new").c_str(), path.c_str()), 0);
}

void TextTest::SetUp()
{
	// Checked here, not in SetUpTestSuite: a failed assertion there would
	// only mark the tests skipped.
	ASSERT_TRUE(start_databases()) << "the test back-end did not start";
	load_names();
	set_translation(nullptr);
}

Obstack::Obstack() { _obstack_begin(&o_, 0, 0, chunk_malloc, std::free); }

std::string Obstack::text()
{
	return std::string(static_cast<const char *>(obstack_base(&o_)), obstack_object_size(&o_));
}

} // namespace text_test

// The test translation: a definition in the program comes before the C
// library's, so the library's lookups of its fixed words end here.
extern "C" char *dcgettext(const char *domain, const char *msgid, int category) noexcept
{
	using namespace text_test;
	if (domain == nullptr || std::strcmp(domain, "vyr") != 0 || category != LC_MESSAGES) {
		g_foreign = true;
		return const_cast<char *>(msgid);
	}
	++g_lookups;
	if (g_words == nullptr)
		return const_cast<char *>(msgid);
	const std::string_view id(msgid);
	const char *word = id == "Low" ? g_words->low : id == "High" ? g_words->high
	                 : id == "No"  ? g_words->no  : id == ":No"  ? g_words->colon_no : nullptr;
	return const_cast<char *>(word != nullptr ? word : msgid);
}
