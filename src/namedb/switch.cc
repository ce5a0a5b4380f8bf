// Start-up, plug-in loading and charset conversion of the name databases.

#include "namedb/switch.hh"

#include "contract/backend.h"
#include "contract/dbroute.h"
#include "contract/tavrel_aux.h"

#include <array>
#include <cstdio>
#include <cstring>
#include <dlfcn.h>
#include <iconv.h>
#include <langinfo.h>
#include <string_view>
#include <strings.h>

namespace vyr::namedb {
namespace {

constexpr size_t kCharsetSize = 32;
constexpr size_t kNoPluginPrefix = 7;
constexpr const char *kNoPluginName = "fileses";

struct DbState {
	int started;
	void *plugin;
	char charset[kCharsetSize]; // locale charset at start-up, NUL-terminated
	int convert;
	void *slots[kSlotCount];
};

// Zero-initialised, constant-initialised: nothing runs at load time.
DbState g_state[3];

using Field = char (dbroute_cfg_t::*)[DBROUTE_NAME_MAX];

struct DbConfig {
	Field backend;
	Field charset;
	std::array<const char *, kSlotCount> slots; // nullptr: no such slot
};

constexpr DbConfig kConfig[3] = {
	{&dbroute_cfg_t::mac_backend,
	 &dbroute_cfg_t::mac_charset,
	 {"openmacdb_r", "closemacdb_r", "setmacent_r", "endmacent_r", "getmacent_r", "getmacnam_r", "getmacuid_r",
	  "putmacent_r", "rmmacnam_r", "do_getlch", "do_setlch"}},
	{&dbroute_cfg_t::lev_backend,
	 &dbroute_cfg_t::lev_charset,
	 {"openlevdb_r", "closelevdb_r", "setlevent_r", "endlevent_r", "getlevent_r", "getlevnam_r", "getlevval_r",
	  "putlevent_r", "rmlevnam_r", "rmlevval_r", nullptr}},
	{&dbroute_cfg_t::cat_backend,
	 &dbroute_cfg_t::cat_charset,
	 {"opencatdb_r", "closecatdb_r", "setcatent_r", "endcatent_r", "getcatent_r", "getcatnam_r", "getcatval_r",
	  "putcatent_r", "rmcatnam_r", "rmcatval_r", nullptr}},
};

DbState &state(Db db) noexcept { return g_state[static_cast<unsigned>(db)]; }
const DbConfig &config(Db db) noexcept { return kConfig[static_cast<unsigned>(db)]; }

// A configuration field as a string bounded by its capacity, so that a
// field without NUL can't lead a read past the block.
std::string_view cfg_text(Field f) noexcept
{
	const char *s = dbroute_cfg.*f;
	return {s, strnlen(s, DBROUTE_NAME_MAX)};
}

// A back-end name that is empty or begins with "fileses" (any case) means
// the database has no plug-in.
bool names_no_plugin(std::string_view backend) noexcept
{
	return backend.empty() ||
	       (backend.size() >= kNoPluginPrefix && strncasecmp(backend.data(), kNoPluginName, kNoPluginPrefix) == 0);
}

// Reports what dlerror has to say, if anything; true if there was a text.
bool take_dlerror(bool print) noexcept
{
	const char *err = dlerror();
	if (err && print)
		std::fprintf(stderr, "%s\n", err);
	return err != nullptr;
}

// Loads the database's plug-in and binds its entries. The file and symbol
// names are short (back-end name < 64 bytes), so they are formatted on the
// stack and the loader has no allocation of its own to fail.
int load_backend(Db db, std::string_view backend) noexcept
{
	DbState &st = state(db);
	const DbConfig &cfg = config(db);
	st.convert = strncasecmp(st.charset, dbroute_cfg.*cfg.charset, kCharsetSize) != 0;

	const int be_len = static_cast<int>(backend.size());
	// The name is formatted as VYR_BACKEND_FILE_FMT, with a bounded back-end
	// name since the configuration field need not end in NUL.
	char file[160];
	std::snprintf(file, sizeof file, "libtavrel-%s-db-%.*s.so.%u", VYR_BACKEND_FILE_WORD, be_len,
		      backend.data(), VYR_BACKEND_FILE_VERSION);

	take_dlerror(false); // drop any stale message from before
	st.plugin = dlopen(file, RTLD_NOW);
	take_dlerror(true);
	if (!st.plugin)
		return -1;

	for (unsigned i = 0; i < kSlotCount; ++i) {
		const char *slot = cfg.slots[i];
		if (!slot)
			break;
		char sym[160];
		std::snprintf(sym, sizeof sym, "%.*s_%s", be_len, backend.data(), slot);
		take_dlerror(false);
		void *addr = dlsym(st.plugin, sym);
		st.slots[i] = take_dlerror(false) ? nullptr : addr;
	}
	st.started = 1;
	return 0;
}

} // namespace

bool start(Db db) noexcept
{
	DbState &st = state(db);
	if (st.started)
		return true;
	if (dbroute_init() < 0)
		return false;
	std::strncpy(st.charset, nl_langinfo(CODESET), kCharsetSize);
	st.charset[kCharsetSize - 1] = '\0';

	const std::string_view backend = cfg_text(config(db).backend);
	if (names_no_plugin(backend)) {
		st.started = 1;
		return true;
	}
	return load_backend(db, backend) == 0;
}

void *bound_slot(Db db, Slot slot, int missing) noexcept
{
	if (!start(db))
		return nullptr;
	void *fn = state(db).slots[slot];
	if (!fn)
		errno = missing;
	return fn;
}

bool converting(Db db) noexcept { return state(db).convert != 0; }

bool default_user_entries() noexcept { return dbroute_cfg.mac_default_entry != 0; }

namespace {

// One conversion through a descriptor opened for this call alone. NULL if
// the charset pair is refused or the text can't be converted.
char *convert(const char *to, const char *from, const char *text) noexcept
{
	iconv_t cd = iconv_open(to, from);
	if (cd == reinterpret_cast<iconv_t>(-1))
		return nullptr;
	char *out = zenk_encode(cd, text);
	iconv_close(cd);
	return out;
}

const char *backend_charset(Db db) noexcept { return dbroute_cfg.*config(db).charset; }

} // namespace

char *copy_to_backend(Db db, const char *name) noexcept
{
	// A refused conversion is no error: the name goes out as it is.
	char *out = convert(backend_charset(db), state(db).charset, name);
	return out ? out : strdup(name);
}

BackendName::BackendName(Db db, const char *name) noexcept
{
	if (!name || !converting(db)) {
		ptr_ = name;
		return;
	}
	owned_.reset(copy_to_backend(db, name));
	ptr_ = owned_.get();
}

void name_to_caller(Db db, char *&name) noexcept
{
	if (!name || !converting(db))
		return;
	char *out = convert(state(db).charset, backend_charset(db), name);
	if (!out)
		return; // stays in the back-end's charset
	std::free(name);
	name = out;
}

} // namespace vyr::namedb
