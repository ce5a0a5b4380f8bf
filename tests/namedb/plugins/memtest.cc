// An in-memory back-end plug-in for the name database tests.
//
// Built once per back-end name (VYR_TEST_BACKEND): "memtest" has every
// entry; "partial" (VYR_TEST_PARTIAL) lacks getlevval_r, rmcatval_r,
// getmacuid_r and do_setlch. Tests seed rows and set the entries' answers
// through the control interface of memtest.h, and read a log of what each
// entry received. Puts only log: they store nothing, so that a put inside
// an allocation-failure sweep leaves no block behind.

#include "namedb/plugins/memtest.h"

#include "contract/backend.h"

#include <algorithm>
#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <pwd.h>
#include <string>
#include <type_traits>
#include <vector>

#ifndef VYR_TEST_BACKEND
#error "VYR_TEST_BACKEND names the back-end"
#endif

#define ND_CAT2(a, b) a##_##b
#define ND_CAT(a, b) ND_CAT2(a, b)
#define ENTRY(x) ND_CAT(VYR_TEST_BACKEND, x)

namespace {

using namespace memtest;

struct Row {
	std::string name;
	uint64_t v[4];
	long long uid;
};

struct Handle {
	unsigned id;
	size_t pos;
};

enum { kMac, kLev, kCat };

std::vector<Row> &rows(int table)
{
	static std::vector<Row> r[3];
	return r[table];
}

long long g_knobs[kKnobCount] = {0, 0, 0, 0, 7, ENOENT, 0};
char g_log[1 << 16];
size_t g_log_len;
Handle g_handles[512];
unsigned g_next_id = 1;
long g_live;
const void *g_last_name, *g_last_record;

// Appends "<entry> #<handle> <payload>" and a newline to the log, in place:
// the log never allocates.
void note(const char *entry, void *db, const char *fmt = "", ...)
{
	auto add = [](const char *f, auto... args) {
		const size_t room = sizeof g_log - g_log_len;
		const int n = std::snprintf(g_log + g_log_len, room, f, args...);
		g_log_len += std::min(static_cast<size_t>(std::max(n, 0)), room - 1);
	};
	if (db)
		add("%s #%u ", entry, static_cast<Handle *>(db)->id);
	else
		add("%s #null ", entry);
	char payload[1200];
	va_list ap;
	va_start(ap, fmt);
	std::vsnprintf(payload, sizeof payload, fmt, ap);
	va_end(ap);
	add("%s\n", payload);
}

// A name as "[bytes]"; the address is kept for memtest_ctl_last_name.
void note_name(const char *entry, void *db, const char *name, const char *extra = "")
{
	g_last_name = name;
	note(entry, db, name ? "[%s]%s" : "%s<null-name>%s", name ? name : "", extra);
}

// A record for the caller: record and name are separate malloc blocks.
template <class E>
E *make(const Row &r)
{
	auto *e = static_cast<E *>(std::calloc(1, sizeof(E)));
	if (!e)
		return nullptr;
	e->name = strdup(r.name.c_str());
	if (!e->name) {
		std::free(e);
		return nullptr;
	}
	if constexpr (std::is_same_v<E, macent_t>) {
		e->lev1 = static_cast<uint8_t>(r.v[0]);
		e->cat1 = r.v[1];
		e->lev2 = static_cast<uint8_t>(r.v[2]);
		e->cat2 = r.v[3];
	} else {
		e->value = static_cast<decltype(e->value)>(r.v[0]);
	}
	return e;
}

void *open_db(const char *entry)
{
	if (g_knobs[kOpenErrno]) {
		note(entry, nullptr, "fail");
		errno = static_cast<int>(g_knobs[kOpenErrno]);
		return nullptr;
	}
	Handle *h = &g_handles[g_next_id % std::size(g_handles)];
	*h = {g_next_id++, 0};
	++g_live;
	note(entry, h);
	return h;
}

// close, set and end, answering the knob `result` (kKnobCount: 0). A close
// ends the handle's life and changes errno, as a successful library call
// may; a set restarts the walk.
int handle_call(const char *entry, void *db, Knob result)
{
	note(entry, db);
	if (result == kCloseResult) {
		errno = EBADE;
		g_live -= db != nullptr;
	}
	if (db && result == kSetResult)
		static_cast<Handle *>(db)->pos = 0;
	return result == kKnobCount ? 0 : static_cast<int>(g_knobs[result]);
}

template <class E>
E *next(const char *entry, int table, void *db)
{
	note(entry, db);
	auto *h = static_cast<Handle *>(db);
	if (!h || h->pos >= rows(table).size())
		return nullptr;
	return make<E>(rows(table)[h->pos++]);
}

// The first row that matches, as a new record. A miss sets kMissErrno, or
// EILSEQ for the value of kEilseqValue.
template <class E, class Match>
E *find(int table, uint64_t value, Match &&match)
{
	for (const Row &r : rows(table))
		if (match(r))
			return make<E>(r);
	const bool eilseq = value && g_knobs[kEilseqValue] == static_cast<long long>(value);
	errno = eilseq ? EILSEQ : static_cast<int>(g_knobs[kMissErrno]);
	return nullptr;
}

template <class E>
E *by_name(const char *entry, int table, void *db, const char *name)
{
	note_name(entry, db, name);
	return find<E>(table, 0, [name](const Row &r) { return name && r.name == name; });
}

template <class E>
E *by_value(const char *entry, int table, void *db, uint64_t v)
{
	note(entry, db, "%llu", static_cast<unsigned long long>(v));
	return find<E>(table, v, [v](const Row &r) { return r.v[0] == v; });
}

template <class E>
int put(const char *entry, void *db, const E *e)
{
	g_last_record = e;
	if (e)
		note_name(entry, db, e->name);
	else
		note(entry, db, "<null-record>");
	return static_cast<int>(g_knobs[kPutResult]);
}

// Removes every row that matches; -1 with ENOENT when there is none.
template <class Match>
int remove_rows(int table, Match &&match)
{
	if (std::erase_if(rows(table), match) != 0)
		return 0;
	errno = ENOENT;
	return -1;
}

int rm_name(const char *entry, int table, void *db, const char *name)
{
	note_name(entry, db, name);
	return remove_rows(table, [name](const Row &r) { return name && r.name == name; });
}

int rm_value(const char *entry, int table, void *db, uint64_t v)
{
	note(entry, db, "%llu", static_cast<unsigned long long>(v));
	return remove_rows(table, [v](const Row &r) { return r.v[0] == v; });
}

int lch(const char *entry, void *pwrec, void *arg)
{
	const auto *pw = static_cast<const passwd *>(pwrec);
	char tag[40];
	std::snprintf(tag, sizeof tag, " arg=%p", arg);
	note_name(entry, nullptr, pw ? pw->pw_name : nullptr, tag);
	return static_cast<int>(g_knobs[kLchResult]);
}

} // namespace

extern "C" {

#define ND_DECLARE(be) VYR_BACKEND_DECLARE(be)
ND_DECLARE(VYR_TEST_BACKEND)

// ---- control interface (memtest.h) ----

void ENTRY(ctl_knob)(int knob, long long value) { g_knobs[knob] = value; }
void ENTRY(ctl_add_mac)(const char *name, unsigned lev1, uint64_t cat1, unsigned lev2, uint64_t cat2, long long uid)
{
	rows(kMac).push_back({name, {lev1, cat1, lev2, cat2}, uid});
}
void ENTRY(ctl_add_lev)(const char *name, unsigned value) { rows(kLev).push_back({name, {value, 0, 0, 0}, -1}); }
void ENTRY(ctl_add_cat)(const char *name, uint64_t value) { rows(kCat).push_back({name, {value, 0, 0, 0}, -1}); }
const char *ENTRY(ctl_log)(void) { return g_log; }
void ENTRY(ctl_clear_log)(void) { g_log[g_log_len = 0] = '\0'; }
long ENTRY(ctl_live_handles)(void) { return g_live; }
const void *ENTRY(ctl_last_name)(void) { return g_last_name; }
const void *ENTRY(ctl_last_record)(void) { return g_last_record; }

// The entries that the three databases share in shape.
#define ND_DB_ENTRIES(db, table)                                                                                  \
	void *ENTRY(open##db##db_r)(void) { return open_db("open" #db "db_r"); }                                   \
	int ENTRY(close##db##db_r)(void *h) { return handle_call("close" #db "db_r", h, kCloseResult); }           \
	int ENTRY(set##db##ent_r)(void *h) { return handle_call("set" #db "ent_r", h, kSetResult); }               \
	int ENTRY(end##db##ent_r)(void *h) { return handle_call("end" #db "ent_r", h, kKnobCount); }               \
	db##ent_t *ENTRY(get##db##ent_r)(void *h) { return next<db##ent_t>("get" #db "ent_r", table, h); }         \
	db##ent_t *ENTRY(get##db##nam_r)(void *h, const char *name)                                               \
	{                                                                                                          \
		return by_name<db##ent_t>("get" #db "nam_r", table, h, name);                                    \
	}                                                                                                          \
	int ENTRY(put##db##ent_r)(void *h, const db##ent_t *e) { return put("put" #db "ent_r", h, e); }            \
	int ENTRY(rm##db##nam_r)(void *h, const char *name) { return rm_name("rm" #db "nam_r", table, h, name); }

ND_DB_ENTRIES(mac, kMac)
ND_DB_ENTRIES(lev, kLev)
ND_DB_ENTRIES(cat, kCat)

int ENTRY(do_getlch)(void *pwrec, void *arg) { return lch("do_getlch", pwrec, arg); }
int ENTRY(rmlevval_r)(void *db, unsigned int value) { return rm_value("rmlevval_r", kLev, db, value); }
catent_t *ENTRY(getcatval_r)(void *db, uint64_t value) { return by_value<catent_t>("getcatval_r", kCat, db, value); }

#ifndef VYR_TEST_PARTIAL
macent_t *ENTRY(getmacuid_r)(void *db, uint32_t uid)
{
	note("getmacuid_r", db, "%u", uid);
	return find<macent_t>(kMac, 0, [uid](const Row &r) { return r.uid == static_cast<long long>(uid); });
}
int ENTRY(do_setlch)(void *pwrec, void *arg) { return lch("do_setlch", pwrec, arg); }
levent_t *ENTRY(getlevval_r)(void *db, unsigned int value) { return by_value<levent_t>("getlevval_r", kLev, db, value); }
int ENTRY(rmcatval_r)(void *db, uint64_t value) { return rm_value("rmcatval_r", kCat, db, value); }
#endif

} // extern "C"
