#include "repr/textin_support.hh"

#include <vyr/text.h>

#include <langinfo.h>
#include <libintl.h>

#include <clocale>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>

#include <gtest/gtest.h>

namespace textin_test {
namespace {
const Words *g_words = nullptr;
} // namespace

void set_translation(const Words *words)
{
	g_words = words;
}

std::string make_temp_dir()
{
	const char *base = std::getenv("TMPDIR");
	std::string templ = std::string(base && *base ? base : "/tmp") + "/vyr-textin-XXXXXX";
	if (mkdtemp(templ.data()) == nullptr) {
		ADD_FAILURE() << "mkdtemp failed";
		return {};
	}
	return templ;
}

void configure_databases(const std::string &backend, const std::string &extra)
{
	const std::string dir = make_temp_dir();
	const std::string conf = dir + "/dbroute.conf";
	const char *charset = nl_langinfo(CODESET);
	std::ofstream out(conf);
	out << "lev_backend = " << backend << "\n"
	    << "lev_charset = " << charset << "\n"
	    << "cat_backend = " << backend << "\n"
	    << "cat_charset = " << charset << "\n"
	    << extra;
	out.close();
	setenv("VYR_DBROUTE_CONF", conf.c_str(), 1);
}

void start_databases()
{
	static bool started = false;
	if (started)
		return;
	started = true;
	backend();
	// One named read per database brings up the plug-in, and a translated
	// word lookup brings up whatever the message lookup keeps.
	uint8_t lev = 0;
	uint64_t cat = 0;
	(void)vyr_lev_from_text("secret", &lev);
	(void)vyr_cat_from_text("alpha", &cat);
	(void)vyr_ilev_from_text("High", &lev);
}

} // namespace textin_test

// The test translation: the readers and writers look the fixed words up
// through dcgettext, which this definition replaces in the test programs.
extern "C" char *dcgettext(const char *domain, const char *msgid, int category) noexcept
{
	using textin_test::g_words;
	const char *out = msgid;
	if (g_words != nullptr && domain != nullptr && std::strcmp(domain, "vyr") == 0 &&
	    category == LC_MESSAGES) {
		const char *word = nullptr;
		if (std::strcmp(msgid, "Low") == 0)
			word = g_words->low;
		else if (std::strcmp(msgid, "High") == 0)
			word = g_words->high;
		else if (std::strcmp(msgid, "No") == 0)
			word = g_words->no;
		else if (std::strcmp(msgid, ":No") == 0)
			word = g_words->colon_no;
		if (word != nullptr)
			out = word;
	}
	return const_cast<char *>(out);
}

// Under LeakSanitizer: the dynamic loader keeps a dependency list for a
// plug-in that is opened again after the program already loaded it (the
// in-memory back-end is linked into the program and opened by libvyr). The
// list lives as long as the plug-in, which is never unloaded, but it hangs
// off a loader record that the leak checker doesn't scan.
extern "C" const char *__lsan_default_suppressions()
{
	return "leak:_dl_map_object_deps\n";
}
