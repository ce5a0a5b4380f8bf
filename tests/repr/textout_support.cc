#include "repr/textout_support.hh"

#include <gtest/gtest.h>

#include <clocale>
#include <dlfcn.h>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <langinfo.h>
#include <libintl.h>
#include <string_view>

namespace textout_test {
namespace {

const Words *g_words = nullptr;
long g_lookups = 0;
bool g_foreign = false;

void *chunk_malloc(long n)
{
	return std::malloc(static_cast<size_t>(n));
}

const char *translate(const char *msgid)
{
	if (g_words == nullptr)
		return msgid;
	const std::string_view id(msgid);
	if (id == "Low")
		return g_words->low;
	if (id == "High")
		return g_words->high;
	if (id == "No")
		return g_words->no;
	if (id == ":No")
		return g_words->colon_no;
	return msgid;
}

} // namespace

void set_translation(const Words *words) { g_words = words; }
long translation_lookups() { return g_lookups; }
bool foreign_lookup_seen() { return g_foreign; }

std::string make_temp_dir()
{
	const char *tmp = std::getenv("TMPDIR");
	std::string templ = std::string(tmp != nullptr && *tmp != '\0' ? tmp : "/tmp") + "/vyr-textout-XXXXXX";
	if (mkdtemp(templ.data()) == nullptr)
		ADD_FAILURE() << "mkdtemp failed";
	return templ;
}

bool preload_backend(const std::string &backend)
{
	const std::string file = "libtavrel-mac-db-" + backend + ".so.2";
	const char *build = std::getenv("VYR_TEST_BUILD_DIR");
	const std::string path = build != nullptr && *build != '\0' ? std::string(build) + "/lib/" + file : file;
	// Never closed: the name databases keep their plug-ins for good as well.
	if (dlopen(path.c_str(), RTLD_NOW) != nullptr)
		return true;
	ADD_FAILURE() << dlerror();
	return false;
}

void remove_tree(const std::string &dir)
{
	std::error_code ec;
	std::filesystem::remove_all(dir, ec);
	EXPECT_FALSE(ec) << dir << ": " << ec.message();
}

std::string configure_databases(const std::string &backend, const std::string &extra)
{
	const std::string dir = make_temp_dir();
	const std::string path = dir + "/dbroute.conf";
	// The charset of the "C" locale, which the test programs never leave, so
	// that names reach the writers unconverted.
	const std::string charset = nl_langinfo(CODESET);
	FILE *f = std::fopen(path.c_str(), "w");
	if (f == nullptr) {
		ADD_FAILURE() << path << ": cannot write";
		return dir;
	}
	std::fprintf(f, "lev_backend = %s\nlev_charset = %s\ncat_backend = %s\ncat_charset = %s\n%s",
	             backend.c_str(), charset.c_str(), backend.c_str(), charset.c_str(), extra.c_str());
	std::fclose(f);
	setenv("VYR_DBROUTE_CONF", path.c_str(), 1);
	return dir;
}

Obstack::Obstack() { _obstack_begin(&o_, 0, 0, chunk_malloc, std::free); }
Obstack::~Obstack() { obstack_free(&o_, nullptr); }

std::string Obstack::text() const
{
	auto *o = const_cast<struct obstack *>(&o_);
	return std::string(static_cast<const char *>(obstack_base(o)), obstack_object_size(o));
}

} // namespace textout_test

// The test translation: the library looks its fixed words up here, since a
// definition in the program comes before the C library's in symbol lookup.
extern "C" char *dcgettext(const char *domain, const char *msgid, int category) noexcept
{
	using namespace textout_test;
	if (domain == nullptr || std::strcmp(domain, "vyr") != 0 || category != LC_MESSAGES) {
		g_foreign = true;
		return const_cast<char *>(msgid);
	}
	++g_lookups;
	return const_cast<char *>(translate(msgid));
}
