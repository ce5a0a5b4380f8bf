#include "repr/textout_fixture.hh"

#include <vyr/namedb.h>

#include <dlfcn.h>

namespace textout_test {

namespace {

MemDb g_mem;

template <class Fn>
bool bind(void *lib, const char *name, Fn *&slot)
{
	slot = reinterpret_cast<Fn *>(dlsym(lib, name));
	EXPECT_NE(slot, nullptr) << name;
	return slot != nullptr;
}

// Binds the control functions once the name databases have loaded the
// plug-in (RTLD_NOLOAD: never a load of its own).
bool bind_controls()
{
	void *lib = dlopen("libtavrel-mac-db-textoutmem.so.2", RTLD_NOW | RTLD_NOLOAD);
	if (lib == nullptr)
		return false;
	const bool all = bind(lib, "textoutmem_reset", g_mem.reset) &&
	                 bind(lib, "textoutmem_add_level", g_mem.add_level) &&
	                 bind(lib, "textoutmem_add_category", g_mem.add_category) &&
	                 bind(lib, "textoutmem_set_open_ok", g_mem.set_open_ok) &&
	                 bind(lib, "textoutmem_set_catset_result", g_mem.set_catset_result) &&
	                 bind(lib, "textoutmem_get_stats", g_mem.get_stats) &&
	                 bind(lib, "textoutmem_clear_stats", g_mem.clear_stats);
	dlclose(lib); // drops only the reference taken here
	return all;
}

} // namespace

const MemDb &mem() { return g_mem; }

void TextOut::SetUpTestSuite()
{
	static const bool started = [] {
		if (!preload_backend("textoutmem"))
			return false;
		const std::string conf_dir = configure_databases("textoutmem");
		// The first call starts both databases (plug-in bound, entries
		// looked up) for the life of the process: do it before anything
		// counts allocations.
		void *db = openlevdb_r();
		if (db != nullptr)
			closelevdb_r(db);
		void *cdb = opencatdb_r();
		if (cdb != nullptr)
			closecatdb_r(cdb);
		remove_tree(conf_dir); // read for good at the start
		return db != nullptr && cdb != nullptr && bind_controls();
	}();
	started_ = started;
}

void TextOut::SetUp()
{
	ASSERT_TRUE(started_) << "the textoutmem back-end did not start";
	mem().reset();
	mem().add_level("public", 0);
	mem().add_level("secret", 5);
	mem().add_level("top", 255);
	mem().add_category("alpha", 0x1);
	mem().add_category("beta", 0x2);
	mem().add_category("pair", 0x6);
	mem().add_category("wide", 0x30);
	mem().add_category("eps", 0x20);
	set_translation(nullptr);
}

} // namespace textout_test
