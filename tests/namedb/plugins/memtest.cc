// An in-memory back-end plug-in, built once per back-end name
// (VYR_TEST_BACKEND): "memtest" has every entry; "partial"
// (VYR_TEST_PARTIAL) lacks getlevval_r, rmcatval_r, getmacuid_r and
// do_setlch. Puts only log, so a put inside a sweep leaves no block behind.
#include "namedb/plugins/memtest.h"

#include "contract/backend.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <pwd.h>
#include <string>
#include <string_view>
#include <vector>

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
enum { kMac, kLev, kCat };

std::vector<Row> g_rows[3];
long long g_knobs[kKnobCount] = {0, 0, 0, 0, 7, ENOENT, 0};
char g_log[1 << 16];
size_t g_log_len;
size_t g_pos[512]; // a handle points at its walk position; its number is the index
unsigned g_next_id = 1;
long g_live;
const void *g_last_arg;

// Appends "<entry> #<handle> <arg>"; never allocates.
void note(const char *entry, void *db, const std::string_view arg) {
	const size_t room = sizeof g_log - g_log_len;
	const int n = db ? std::snprintf(g_log + g_log_len, room, "%s #%zu %.*s\n", entry, static_cast<size_t *>(db) - g_pos,
					 int(arg.size()), arg.data())
			 : std::snprintf(g_log + g_log_len, room, "%s #null %.*s\n", entry, int(arg.size()), arg.data());
	g_log_len += std::min(static_cast<size_t>(std::max(n, 0)), room - 1);
}

void note_name(const char *entry, void *db, const void *arg, const char *name) {
	char text[1200];
	std::snprintf(text, sizeof text, name ? "[%s]" : "<null-name>", name);
	note(entry, db, text), g_last_arg = arg;
}

void note_value(const char *entry, void *db, uint64_t v) {
	char text[24];
	note(entry, db, std::string_view(text, std::to_chars(text, text + sizeof text, v).ptr));
}

// Record and name are separate malloc blocks, as libvyr expects.
template <class E>
E *make(const Row &r) {
	auto *e = static_cast<E *>(std::calloc(1, sizeof(E)));
	if (!e || !(e->name = strdup(r.name.c_str()))) {
		std::free(e);
		return nullptr;
	}
	if constexpr (requires { e->lev1; })
		*e = {e->name, static_cast<uint8_t>(r.v[0]), r.v[1], static_cast<uint8_t>(r.v[2]), r.v[3]};
	else
		e->value = static_cast<decltype(e->value)>(r.v[0]);
	return e;
}

void *open_db(const char *entry) {
	if (g_knobs[kOpenErrno]) {
		note(entry, nullptr, "fail");
		errno = static_cast<int>(g_knobs[kOpenErrno]);
		return nullptr;
	}
	size_t *h = &g_pos[g_next_id++ % std::size(g_pos)];
	*h = 0;
	++g_live;
	note(entry, h, "");
	return h;
}

// close, set and end. A close changes errno, as a successful call may.
int handle_call(const char *entry, void *db, Knob result) {
	note(entry, db, "");
	if (result == kCloseResult) {
		errno = EBADE;
		g_live -= db != nullptr;
	}
	if (db && result == kSetResult)
		*static_cast<size_t *>(db) = 0;
	return result == kKnobCount ? 0 : static_cast<int>(g_knobs[result]);
}

template <class E>
E *next(const char *entry, int table, void *db) {
	note(entry, db, "");
	auto *pos = static_cast<size_t *>(db);
	return pos && *pos < g_rows[table].size() ? make<E>(g_rows[table][(*pos)++]) : nullptr;
}

// The first matching row; a miss sets kMissErrno, or EILSEQ for kEilseqValue.
template <class E, class Match>
E *find(int table, uint64_t value, Match &&match) {
	for (const Row &r : g_rows[table])
		if (match(r))
			return make<E>(r);
	const bool eilseq = value && g_knobs[kEilseqValue] == static_cast<long long>(value);
	errno = eilseq ? EILSEQ : static_cast<int>(g_knobs[kMissErrno]);
	return nullptr;
}

template <class Match>
int remove_rows(int table, Match &&match) {
	if (std::erase_if(g_rows[table], match) != 0)
		return 0;
	errno = ENOENT;
	return -1;
}

auto named(const char *name) { return [name](const Row &r) { return name && r.name == name; }; }
auto valued(uint64_t v) { return [v](const Row &r) { return r.v[0] == v; }; }

// The entries behind the macros below, one line each.
template <class E>
E *by_name(const char *what, int t, void *h, const char *n) { return note_name(what, h, n, n), find<E>(t, 0, named(n)); }
template <class E>
E *by_value(const char *what, int t, void *h, uint64_t v) { return note_value(what, h, v), find<E>(t, v, valued(v)); }
int rm_name(const char *what, int t, void *h, const char *n) { return note_name(what, h, n, n), remove_rows(t, named(n)); }
int rm_value(const char *what, int t, void *h, uint64_t v) { return note_value(what, h, v), remove_rows(t, valued(v)); }
template <class E>
int put(const char *what, void *h, const E *e) {
	e ? note_name(what, h, e, e->name) : note(what, h, "<null-record>");
	return static_cast<int>(g_knobs[kPutResult]);
}

int lch(const char *entry, void *pwrec, void *arg) {
	char text[1200];
	std::snprintf(text, sizeof text, "[%s] arg=%p", static_cast<const passwd *>(pwrec)->pw_name, arg);
	note(entry, nullptr, text);
	return static_cast<int>(g_knobs[kLchResult]);
}
} // namespace

extern "C" {
#define ND_DECLARE(be) VYR_BACKEND_DECLARE(be)
ND_DECLARE(VYR_TEST_BACKEND)

void ENTRY(ctl_knob)(int knob, long long value) { g_knobs[knob] = value; }
void ENTRY(ctl_add_mac)(const char *name, unsigned lev1, uint64_t cat1, unsigned lev2, uint64_t cat2, long long uid) {
	g_rows[kMac].push_back({name, {lev1, cat1, lev2, cat2}, uid});
}
void ENTRY(ctl_add_lev)(const char *name, unsigned value) { g_rows[kLev].push_back({name, {value}, -1}); }
void ENTRY(ctl_add_cat)(const char *name, uint64_t value) { g_rows[kCat].push_back({name, {value}, -1}); }
const char *ENTRY(ctl_log)(void) { return g_log; }
void ENTRY(ctl_clear_log)(void) { g_log[g_log_len = 0] = '\0'; }
long ENTRY(ctl_live_handles)(void) { return g_live; }
const void *ENTRY(ctl_last_arg)(void) { return g_last_arg; }

// The entries that the three databases share in shape.
#define ND_DB_ENTRIES(db, t)                                                                                       \
	void *ENTRY(open##db##db_r)(void) { return open_db("open" #db "db_r"); }                                    \
	int ENTRY(close##db##db_r)(void *h) { return handle_call("close" #db "db_r", h, kCloseResult); }            \
	int ENTRY(set##db##ent_r)(void *h) { return handle_call("set" #db "ent_r", h, kSetResult); }                \
	int ENTRY(end##db##ent_r)(void *h) { return handle_call("end" #db "ent_r", h, kKnobCount); }                \
	db##ent_t *ENTRY(get##db##ent_r)(void *h) { return next<db##ent_t>("get" #db "ent_r", t, h); }              \
	db##ent_t *ENTRY(get##db##nam_r)(void *h, const char *n) { return by_name<db##ent_t>("get" #db "nam_r", t, h, n); } \
	int ENTRY(put##db##ent_r)(void *h, const db##ent_t *e) { return put("put" #db "ent_r", h, e); }             \
	int ENTRY(rm##db##nam_r)(void *h, const char *n) { return rm_name("rm" #db "nam_r", t, h, n); }
ND_DB_ENTRIES(mac, kMac)
ND_DB_ENTRIES(lev, kLev)
ND_DB_ENTRIES(cat, kCat)

int ENTRY(do_getlch)(void *pwrec, void *arg) { return lch("do_getlch", pwrec, arg); }
int ENTRY(rmlevval_r)(void *h, unsigned int v) { return rm_value("rmlevval_r", kLev, h, v); }
catent_t *ENTRY(getcatval_r)(void *h, uint64_t v) { return by_value<catent_t>("getcatval_r", kCat, h, v); }
#ifndef VYR_TEST_PARTIAL
int ENTRY(do_setlch)(void *pwrec, void *arg) { return lch("do_setlch", pwrec, arg); }
int ENTRY(rmcatval_r)(void *h, uint64_t v) { return rm_value("rmcatval_r", kCat, h, v); }
levent_t *ENTRY(getlevval_r)(void *h, unsigned int v) { return by_value<levent_t>("getlevval_r", kLev, h, v); }
macent_t *ENTRY(getmacuid_r)(void *h, uint32_t uid) {
	note_value("getmacuid_r", h, uid);
	return find<macent_t>(kMac, 0, [uid](const Row &r) { return r.uid == uid; });
}
#endif
} // extern "C"
