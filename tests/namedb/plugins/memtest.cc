// An in-memory back-end plug-in for the name database tests.
//
// Knobs: open_errno, close_result, set_result, put_result, lch_result,
// miss_errno (default ENOENT), lev_eilseq / cat_eilseq (a value reported as
// existing without a record), quiet (no log), log_ptrs (addresses in the
// log), no_store (puts change nothing).
//
// Built once per back-end name (VYR_TEST_BACKEND): "memtest" has every
// entry; "partial" (VYR_TEST_PARTIAL) lacks getlevval_r, rmcatval_r,
// getmacuid_r and do_setlch. Besides the entries, each build exports a small
// control interface <backend>_ctl_* through which tests seed the data, set
// the answers of the entries and read the log: one line per entry call with
// the exact bytes of the name it received.
//
// Entries keep insertion order, which is the walk order.

#include "contract/backend.h"

#include <cerrno>
#include <cinttypes>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <map>
#include <pwd.h>
#include <string>
#include <vector>

#ifndef VYR_TEST_BACKEND
#error "VYR_TEST_BACKEND names the back-end"
#endif

#define ND_CAT2(a, b) a##_##b
#define ND_CAT(a, b) ND_CAT2(a, b)
#define ENTRY(x) ND_CAT(VYR_TEST_BACKEND, x)

namespace {

struct Row {
	std::string name;
	uint64_t v[4];
	long long uid = -1; // user rows only; -1: no uid
};

struct Handle {
	unsigned id;
	size_t pos;
};

struct Store {
	std::vector<Row> rows[3]; // mac, lev, cat
	std::vector<std::string> log;
	std::map<std::string, long long> knobs;
	unsigned next_id = 1;
	long live_handles = 0;
};

Store &store()
{
	static Store s;
	return s;
}

enum { kMac, kLev, kCat };

long long knob(const char *key, long long dflt)
{
	auto it = store().knobs.find(key);
	return it == store().knobs.end() ? dflt : it->second;
}

std::string handle_tag(void *db)
{
	return db ? "#" + std::to_string(static_cast<Handle *>(db)->id) : std::string("#null");
}

// Appends "<entry> <handle> <payload>" to the log. The payload is built
// only when logging is on: with the knob "quiet" set, the plug-in allocates
// nothing but the records it returns, as allocation-failure tests need.
template <class Payload>
void log_call(const char *entry, void *db, Payload &&payload)
{
	if (knob("quiet", 0))
		return;
	store().log.push_back(std::string(entry) + " " + handle_tag(db) + " " + payload());
}

void log_call(const char *entry, void *db)
{
	log_call(entry, db, [] { return std::string(); });
}

// "[bytes]" of a name, with "@address" when the knob "log_ptrs" is set, so
// that tests can tell the caller's own string from a copy.
std::string name_payload(const char *name)
{
	if (!name)
		return "<null-name>";
	std::string out = "[" + std::string(name) + "]";
	if (knob("log_ptrs", 0)) {
		char at[32];
		std::snprintf(at, sizeof at, "@%p", static_cast<const void *>(name));
		out += at;
	}
	return out;
}

char *dup_name(const std::string &s)
{
	char *p = static_cast<char *>(std::malloc(s.size() + 1));
	if (p)
		std::memcpy(p, s.c_str(), s.size() + 1);
	return p;
}

// A record for the caller: record and name are separate malloc blocks.
template <class E>
E *make(const Row &r);

template <>
macent_t *make<macent_t>(const Row &r)
{
	auto *e = static_cast<macent_t *>(std::calloc(1, sizeof(macent_t)));
	if (!e)
		return nullptr;
	e->name = dup_name(r.name);
	if (!e->name) {
		std::free(e);
		return nullptr;
	}
	e->lev1 = static_cast<uint8_t>(r.v[0]);
	e->cat1 = r.v[1];
	e->lev2 = static_cast<uint8_t>(r.v[2]);
	e->cat2 = r.v[3];
	return e;
}

template <>
levent_t *make<levent_t>(const Row &r)
{
	auto *e = static_cast<levent_t *>(std::calloc(1, sizeof(levent_t)));
	if (!e)
		return nullptr;
	e->name = dup_name(r.name);
	if (!e->name) {
		std::free(e);
		return nullptr;
	}
	e->value = static_cast<uint8_t>(r.v[0]);
	return e;
}

template <>
catent_t *make<catent_t>(const Row &r)
{
	auto *e = static_cast<catent_t *>(std::calloc(1, sizeof(catent_t)));
	if (!e)
		return nullptr;
	e->name = dup_name(r.name);
	if (!e->name) {
		std::free(e);
		return nullptr;
	}
	e->value = r.v[0];
	return e;
}

Row row_of(const macent_t &e) { return {e.name, {e.lev1, e.cat1, e.lev2, e.cat2}, -1}; }
Row row_of(const levent_t &e) { return {e.name, {e.value, 0, 0, 0}, -1}; }
Row row_of(const catent_t &e) { return {e.name, {e.value, 0, 0, 0}, -1}; }

void *open_db(const char *entry)
{
	if (long long e = knob("open_errno", 0)) {
		log_call(entry, nullptr, [] { return std::string("fail"); });
		errno = static_cast<int>(e);
		return nullptr;
	}
	auto *h = new Handle{store().next_id++, 0};
	++store().live_handles;
	log_call(entry, h);
	return h;
}

int close_db(const char *entry, void *db)
{
	log_call(entry, db);
	if (db) {
		delete static_cast<Handle *>(db);
		--store().live_handles;
	}
	return static_cast<int>(knob("close_result", 0));
}

int set_db(const char *entry, void *db)
{
	log_call(entry, db);
	if (db)
		static_cast<Handle *>(db)->pos = 0;
	return static_cast<int>(knob("set_result", 0));
}

int end_db(const char *entry, void *db)
{
	log_call(entry, db);
	return 0;
}

template <class E>
E *next(const char *entry, int table, void *db)
{
	log_call(entry, db);
	auto *h = static_cast<Handle *>(db);
	const auto &rows = store().rows[table];
	if (!h || h->pos >= rows.size())
		return nullptr;
	return make<E>(rows[h->pos++]);
}

void miss()
{
	errno = static_cast<int>(knob("miss_errno", ENOENT));
}

template <class E>
E *by_name(const char *entry, int table, void *db, const char *name)
{
	log_call(entry, db, [name] { return name_payload(name); });
	for (const Row &r : store().rows[table])
		if (name && r.name == name)
			return make<E>(r);
	miss();
	return nullptr;
}

// Lookup by value; `eilseq_knob` names a value that is declared to exist
// without a record.
template <class E>
E *by_value(const char *entry, int table, void *db, uint64_t v, const char *eilseq_knob)
{
	log_call(entry, db, [v] { return std::to_string(v); });
	for (const Row &r : store().rows[table])
		if (r.v[0] == v)
			return make<E>(r);
	if (eilseq_knob && knob(eilseq_knob, -1) == static_cast<long long>(v)) {
		errno = EILSEQ;
		return nullptr;
	}
	miss();
	return nullptr;
}

template <class E>
int put(const char *entry, int table, void *db, const E *e)
{
	if (!e) {
		log_call(entry, db, [] { return std::string("<null-record>"); });
		return static_cast<int>(knob("put_result", 0));
	}
	log_call(entry, db, [e] {
		char at[32] = "";
		if (knob("log_ptrs", 0))
			std::snprintf(at, sizeof at, " rec@%p", static_cast<const void *>(e));
		return name_payload(e->name) + at;
	});
	if (e->name && !knob("no_store", 0)) {
		auto &rows = store().rows[table];
		Row r = row_of(*e);
		bool replaced = false;
		for (Row &old : rows)
			if (old.name == r.name) {
				r.uid = old.uid;
				old = r;
				replaced = true;
			}
		if (!replaced)
			rows.push_back(r);
	}
	return static_cast<int>(knob("put_result", 0));
}

template <class Payload>
int remove_if(const char *entry, int table, void *db, Payload &&payload, bool (*match)(const Row &, const void *),
	      const void *key)
{
	log_call(entry, db, payload);
	auto &rows = store().rows[table];
	const size_t before = rows.size();
	std::erase_if(rows, [&](const Row &r) { return match(r, key); });
	if (rows.size() == before) {
		errno = ENOENT;
		return -1;
	}
	return 0;
}

bool match_name(const Row &r, const void *key) { return r.name == static_cast<const char *>(key); }
bool match_value(const Row &r, const void *key) { return r.v[0] == *static_cast<const uint64_t *>(key); }

int rm_name(const char *entry, int table, void *db, const char *name)
{
	if (!name) {
		log_call(entry, db, [] { return std::string("<null-name>"); });
		return -1;
	}
	return remove_if(entry, table, db, [name] { return name_payload(name); }, match_name, name);
}

int rm_value(const char *entry, int table, void *db, uint64_t v)
{
	return remove_if(entry, table, db, [v] { return std::to_string(v); }, match_value, &v);
}

int lch(const char *entry, void *pwrec, void *arg)
{
	const auto *pw = static_cast<const passwd *>(pwrec);
	log_call(entry, nullptr, [pw, arg] {
		char tag[64];
		std::snprintf(tag, sizeof tag, " arg=%p", arg);
		return name_payload(pw ? pw->pw_name : nullptr) + tag;
	});
	return static_cast<int>(knob("lch_result", 7));
}

} // namespace

extern "C" {

#define ND_DECLARE(be) VYR_BACKEND_DECLARE(be)
ND_DECLARE(VYR_TEST_BACKEND)

// ---- control interface for the tests ----

void ENTRY(ctl_reset)(void)
{
	Store &s = store();
	for (auto &t : s.rows)
		t.clear();
	s.log.clear();
	s.knobs.clear();
}

void ENTRY(ctl_knob)(const char *key, long long value) { store().knobs[key] = value; }

void ENTRY(ctl_add_mac)(const char *name, unsigned lev1, uint64_t cat1, unsigned lev2, uint64_t cat2, long long uid)
{
	store().rows[kMac].push_back({name, {lev1, cat1, lev2, cat2}, uid});
}
void ENTRY(ctl_add_lev)(const char *name, unsigned value) { store().rows[kLev].push_back({name, {value, 0, 0, 0}, -1}); }
void ENTRY(ctl_add_cat)(const char *name, uint64_t value) { store().rows[kCat].push_back({name, {value, 0, 0, 0}, -1}); }

// The log as one string, a line per entry call; valid until the next call.
const char *ENTRY(ctl_log)(void)
{
	static std::string joined;
	joined.clear();
	for (const auto &line : store().log)
		joined += line + "\n";
	return joined.c_str();
}
void ENTRY(ctl_clear_log)(void) { store().log.clear(); }
long ENTRY(ctl_live_handles)(void) { return store().live_handles; }
size_t ENTRY(ctl_rows)(int table) { return store().rows[table].size(); }

// ---- user label database ----

void *ENTRY(openmacdb_r)(void) { return open_db("openmacdb_r"); }
int ENTRY(closemacdb_r)(void *db) { return close_db("closemacdb_r", db); }
int ENTRY(setmacent_r)(void *db) { return set_db("setmacent_r", db); }
int ENTRY(endmacent_r)(void *db) { return end_db("endmacent_r", db); }
macent_t *ENTRY(getmacent_r)(void *db) { return next<macent_t>("getmacent_r", kMac, db); }
macent_t *ENTRY(getmacnam_r)(void *db, const char *name)
{
	return by_name<macent_t>("getmacnam_r", kMac, db, name);
}
int ENTRY(putmacent_r)(void *db, const macent_t *e) { return put("putmacent_r", kMac, db, e); }
int ENTRY(rmmacnam_r)(void *db, const char *name) { return rm_name("rmmacnam_r", kMac, db, name); }
int ENTRY(do_getlch)(void *pwrec, void *arg) { return lch("do_getlch", pwrec, arg); }
#ifndef VYR_TEST_PARTIAL
macent_t *ENTRY(getmacuid_r)(void *db, uint32_t uid)
{
	log_call("getmacuid_r", db, [uid] { return std::to_string(uid); });
	for (const Row &r : store().rows[kMac])
		if (r.uid == static_cast<long long>(uid))
			return make<macent_t>(r);
	miss();
	return nullptr;
}
int ENTRY(do_setlch)(void *pwrec, void *arg) { return lch("do_setlch", pwrec, arg); }
#endif

// ---- level database ----

void *ENTRY(openlevdb_r)(void) { return open_db("openlevdb_r"); }
int ENTRY(closelevdb_r)(void *db) { return close_db("closelevdb_r", db); }
int ENTRY(setlevent_r)(void *db) { return set_db("setlevent_r", db); }
int ENTRY(endlevent_r)(void *db) { return end_db("endlevent_r", db); }
levent_t *ENTRY(getlevent_r)(void *db) { return next<levent_t>("getlevent_r", kLev, db); }
levent_t *ENTRY(getlevnam_r)(void *db, const char *name)
{
	return by_name<levent_t>("getlevnam_r", kLev, db, name);
}
int ENTRY(putlevent_r)(void *db, const levent_t *e) { return put("putlevent_r", kLev, db, e); }
int ENTRY(rmlevnam_r)(void *db, const char *name) { return rm_name("rmlevnam_r", kLev, db, name); }
int ENTRY(rmlevval_r)(void *db, unsigned int value) { return rm_value("rmlevval_r", kLev, db, value); }
#ifndef VYR_TEST_PARTIAL
levent_t *ENTRY(getlevval_r)(void *db, unsigned int value)
{
	return by_value<levent_t>("getlevval_r", kLev, db, value, "lev_eilseq");
}
#endif

// ---- category database ----

void *ENTRY(opencatdb_r)(void) { return open_db("opencatdb_r"); }
int ENTRY(closecatdb_r)(void *db) { return close_db("closecatdb_r", db); }
int ENTRY(setcatent_r)(void *db) { return set_db("setcatent_r", db); }
int ENTRY(endcatent_r)(void *db) { return end_db("endcatent_r", db); }
catent_t *ENTRY(getcatent_r)(void *db) { return next<catent_t>("getcatent_r", kCat, db); }
catent_t *ENTRY(getcatnam_r)(void *db, const char *name)
{
	return by_name<catent_t>("getcatnam_r", kCat, db, name);
}
catent_t *ENTRY(getcatval_r)(void *db, uint64_t value)
{
	return by_value<catent_t>("getcatval_r", kCat, db, value, "cat_eilseq");
}
int ENTRY(putcatent_r)(void *db, const catent_t *e) { return put("putcatent_r", kCat, db, e); }
int ENTRY(rmcatnam_r)(void *db, const char *name) { return rm_name("rmcatnam_r", kCat, db, name); }
#ifndef VYR_TEST_PARTIAL
int ENTRY(rmcatval_r)(void *db, uint64_t value) { return rm_value("rmcatval_r", kCat, db, value); }
#endif

} // extern "C"
