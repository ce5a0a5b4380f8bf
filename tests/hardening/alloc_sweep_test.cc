// Allocation failure in the exported calls that no other test sweeps: the
// database calls through the files back-end (handle, static-result and wide
// forms, lookups, walks and writes), the stream readers and writers of the
// static and wide layers, the text calls that look names up, and a record
// and a string builder.
//
// Each row is swept: for n = 1, 2, ... the n-th allocation of the call fails.
// A call that fails must fail as a whole (NULL or -1, errno ENOMEM where the
// row says so, a database file untouched); a call that copes with the failure
// (a conversion falling back, a stdio buffer doing without) must still give
// the right answer. Nothing may leak either way.
#include <vyr/label.h>
#include <vyr/namedb.h>
#include <vyr/text.h>

#include "hardening/files_db.hh"
#include "support/failalloc.h"
#include "support/obstack_guard.hh"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <cwchar>
#include <type_traits>
#include <functional>
#include <obstack.h>
#include <pwd.h>
#include <string>
#include <vector>

namespace hardening {
namespace {

// ---- describing results, outside the injected window ----

std::string name_of(const char *name) { return name ? name : "(null)"; }
std::string show(const levent_t &e) { return name_of(e.name) + ":" + std::to_string(e.value); }
std::string show(const catent_t &e) { return name_of(e.name) + ":" + std::to_string(e.value); }
std::string show(const macent_t &e)
{
	return name_of(e.name) + ":" + std::to_string(e.lev1) + ":" + std::to_string(e.cat1) + ":" +
	       std::to_string(e.lev2) + ":" + std::to_string(e.cat2);
}
std::string narrow(const wchar_t *w)
{
	if (w == nullptr)
		return "(null)";
	std::string s;
	for (; *w != L'\0'; ++w)
		s += static_cast<char>(*w); // the scratch names are ASCII
	return s;
}
std::string show(const wclevent_t &e) { return narrow(e.name) + ":" + std::to_string(e.value); }
std::string show(const wccatent_t &e) { return narrow(e.name) + ":" + std::to_string(e.value); }
std::string show(const wcmacent_t &e)
{
	return narrow(e.name) + ":" + std::to_string(e.lev1) + ":" + std::to_string(e.cat1) + ":" +
	       std::to_string(e.lev2) + ":" + std::to_string(e.cat2);
}

void release(levent_t *e) { freelevent_r(e); }
void release(catent_t *e) { freecatent_r(e); }
void release(macent_t *e) { freemacent_r(e); }
void release(wclevent_t *e) { wcfreelevent(e); }
void release(wccatent_t *e) { wcfreecatent(e); }
void release(wcmacent_t *e) { wcfreemacent(e); }
// What one attempt gave: success or failure with its errno, and a text to
// compare (the record, the value read, or the database file afterwards).
struct Outcome {
	bool ok = false;
	int err = 0;
	std::string text;
};

using Attempt = std::function<Outcome(vyr_test::Injector &)>;

struct Row {
	const char *what;
	Attempt attempt;
	std::string expected;  // text of a successful attempt
	std::string unchanged; // text after a failed attempt ("" when there is none)
	// A failure must carry ENOMEM. Not for the put calls: without memory for
	// the back-end's copy of the record, the back-end is handed NULL and
	// answers with its own errno (EINVAL).
	bool enomem = true;
	// Successful answers that the call's rules allow when an allocation
	// failed.
	std::vector<std::string> also = {};
};

// Runs call() inside the injected window and keeps its errno.
template <class Call>
auto injected(vyr_test::Injector &inj, Call call, int &err)
{
	return inj.run([&] {
		errno = 0;
		auto r = call();
		err = errno;
		return r;
	});
}

// A call returning a record that the caller frees. The call runs once
// before the window, so that the back-end's cache of the file is current and
// nothing the window allocates is legitimately kept.
template <class Call>
Attempt record(Call call)
{
	return [call](vyr_test::Injector &inj) {
		if (auto *warm = call())
			release(warm);
		int err = 0;
		auto *r = injected(inj, call, err);
		if (r == nullptr)
			return Outcome{false, err, ""};
		Outcome o{true, 0, show(*r)};
		release(r);
		return o;
	};
}

// A call of the static-result layer: the record is the library's.
template <class Call>
Attempt static_record(Call call)
{
	return [call](vyr_test::Injector &inj) {
		call();
		int err = 0;
		auto *r = injected(inj, call, err);
		return r == nullptr ? Outcome{false, err, ""} : Outcome{true, 0, show(*r)};
	};
}

// A write to a database: the outcome's text is the file afterwards, which is
// then put back as it was for the next attempt.
template <class Call>
Attempt write(const ScratchDb &db, const char *file, Call call)
{
	return [&db, file, call](vyr_test::Injector &inj) {
		const std::string path = db.path(file);
		const std::string before = read_file(path);
		int err = 0;
		const int rc = injected(inj, call, err);
		Outcome o{rc == 0, rc == 0 ? 0 : err, read_file(path)};
		install_file(path, before);
		return o;
	};
}

// A reader of one field: the outcome's text is the value read.
template <class T, class Call>
Attempt field(Call call)
{
	return [call](vyr_test::Injector &inj) {
		T value{};
		call(&value); // brings the back-end's cache up to date, as in record()
		int err = 0;
		const int rc = injected(inj, [&] { return call(&value); }, err);
		return rc == 0 ? Outcome{true, 0, std::to_string(value)} : Outcome{false, err, ""};
	};
}

// A writer to the caller's obstack. The obstack gets a first chunk large
// enough for the text, so that only the call's own allocations are swept
// (an obstack that can't grow is the application's failure handler's).
template <class Call>
Attempt obstack_text(Call call)
{
	return [call](vyr_test::Injector &inj) {
		struct obstack o;
		obstack_specify_allocation(&o, 4096, 0, std::malloc, std::free);
		call(&o); // brings the back-end's cache up to date, as in record()
		obstack_free(&o, nullptr);
		obstack_specify_allocation(&o, 4096, 0, std::malloc, std::free);
		int err = 0;
		const int n = injected(inj, [&] { return call(&o); }, err);
		Outcome out{n >= 0, n >= 0 ? 0 : err, ""};
		if (n >= 0)
			out.text.assign(static_cast<const char *>(obstack_base(&o)), obstack_object_size(&o));
		obstack_free(&o, nullptr);
		return out;
	};
}

// Describes a record into a caller's buffer without touching the heap, so
// that it may run inside the injected window (static results are gone after
// the next call of the same function).
template <class Name>
void describe(char *buf, size_t n, const Name *name, uint64_t value)
{
	char plain[64] = "(null)";
	size_t i = 0;
	for (; name != nullptr && name[i] != 0 && i + 1 < sizeof plain; ++i)
		plain[i] = static_cast<char>(name[i]); // the scratch names are ASCII
	if (name != nullptr)
		plain[i] = '\0';
	const size_t used = std::strlen(buf);
	std::snprintf(buf + used, n - used, "%s%s:%llu", used ? "|" : "", plain,
	              static_cast<unsigned long long>(value));
}
template <class E>
void describe(char *buf, size_t n, const E &e)
{
	describe(buf, n, e.name, e.value);
}

// A stream reader or writer over a file in the scratch directory.
// call(fp, buf, size) returns whether it succeeded; readers describe what
// they read into buf, writers leave it alone and the file is the text.
template <class Call>
Attempt stream(const ScratchDb &db, const char *file, const char *mode, Call call)
{
	return [&db, file, mode, call](vyr_test::Injector &inj) {
		const std::string path = db.path(file);
		FILE *fp = std::fopen(path.c_str(), mode);
		if (fp == nullptr)
			return Outcome{false, errno, "cannot open " + path};
		char buf[256] = "";
		int err = 0;
		const bool ok = injected(inj, [&] { return call(fp, buf, sizeof buf); }, err);
		std::fclose(fp);
		std::string text = buf;
		if (std::string(mode) == "w") {
			text = read_file(path);
			std::remove(path.c_str());
		}
		return Outcome{ok, ok ? 0 : err, text};
	};
}

void sweep(const Row &row)
{
	SCOPED_TRACE(row.what);
	long failed_attempts = 0;
	const long attempts = vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		const Outcome o = row.attempt(inj);
		if (!inj.fired()) {
			EXPECT_TRUE(o.ok) << "errno " << o.err;
			EXPECT_EQ(o.text, row.expected);
			return;
		}
		if (o.ok) {
			if (std::find(row.also.begin(), row.also.end(), o.text) == row.also.end()) {
				EXPECT_EQ(o.text, row.expected) << "a call that coped with failing allocation " << inj.n();
			}
			return;
		}
		++failed_attempts;
		EXPECT_EQ(o.text, row.unchanged) << "failing allocation " << inj.n();
		if (row.enomem) {
			EXPECT_EQ(o.err, ENOMEM) << "failing allocation " << inj.n();
		}
	});
	EXPECT_GT(attempts, 1) << "the call allocated nothing";
	std::printf("%-28s %3ld allocations, %3ld failed as a whole\n", row.what, attempts - 1, failed_attempts);
}

class AllocSweep : public ::testing::Test {
protected:
	static void SetUpTestSuite()
	{
		db_ = new ScratchDb();
		// Start the three databases outside any sweep: start-up state is
		// kept for the life of the process.
		// A uid lookup that misses the passwd file makes glibc load its next
		// user database module, which it keeps: load it now, not in a sweep.
		errno = 0;
		::getpwnam("vyr-hardening-no-such-user");
		void *m = openmacdb_r(), *l = openlevdb_r(), *c = opencatdb_r();
		ASSERT_TRUE(m != nullptr && l != nullptr && c != nullptr);
		closemacdb_r(m);
		closelevdb_r(l);
		closecatdb_r(c);
	}
	static void TearDownTestSuite()
	{
		delete db_;
		db_ = nullptr;
	}
	static ScratchDb *db_;
};
ScratchDb *AllocSweep::db_ = nullptr;

// Runs f with a handle of the database, closed again inside the call.
template <class Open, class Close, class F>
auto with_handle(Open open, Close close, F f)
{
	return [=] {
		void *h = open();
		using R = decltype(f(h));
		R r{};
		if constexpr (std::is_same_v<R, int>)
			r = -1; // a status call fails with its database
		if (h != nullptr) {
			r = f(h);
			const int saved = errno;
			close(h);
			errno = saved;
		}
		return r;
	};
}

template <class F>
auto lev(F f) { return with_handle(openlevdb_r, closelevdb_r, f); }
template <class F>
auto cat(F f) { return with_handle(opencatdb_r, closecatdb_r, f); }
template <class F>
auto mac(F f) { return with_handle(openmacdb_r, closemacdb_r, f); }

// The second entry of a walk, so that the walk's own state is exercised.
template <class Set, class Get, class End>
auto second_of_walk(Set set, Get get, End end)
{
	return [=](void *h) -> decltype(get(h)) {
		if (set(h) != 0)
			return nullptr;
		auto *first = get(h);
		if (first == nullptr) {
			const int saved = errno;
			end(h);
			errno = saved;
			return nullptr;
		}
		release(first);
		auto *second = get(h);
		const int saved = errno;
		end(h);
		errno = saved;
		return second;
	};
}

TEST_F(AllocSweep, HandleLookupsWalksAndWrites)
{
	const ScratchDb &db = *db_;
	const std::string levels = ScratchDb::kLevels, cats = ScratchDb::kCategories, users = ScratchDb::kUsers;
	const levent_t new_lev{const_cast<char *>("restricted"), 5};
	const catent_t new_cat{const_cast<char *>("legal"), 0x20};
	const macent_t new_user{const_cast<char *>("bob"), 1, 0x8, 2, 0x10};

	const Row rows[] = {
		{"getlevnam_r", record(lev([](void *h) { return getlevnam_r(h, "secret"); })), "secret:3", ""},
		{"getlevval_r", record(lev([](void *h) { return getlevval_r(h, 200); })), "top:200", ""},
		{"getlevent_r (walk)", record(lev(second_of_walk(setlevent_r, getlevent_r, endlevent_r))), "secret:3", ""},
		{"getcatnam_r", record(cat([](void *h) { return getcatnam_r(h, "human"); })), "human:16", ""},
		{"getcatval_r", record(cat([](void *h) { return getcatval_r(h, 0x100000000); })), "ops:4294967296", ""},
		{"getcatent_r (walk)", record(cat(second_of_walk(setcatent_r, getcatent_r, endcatent_r))), "human:16", ""},
		{"getmacnam_r", record(mac([](void *h) { return getmacnam_r(h, "alice"); })), "alice:0:16:3:0", ""},
		{"getmacuid_r", record(mac([](void *h) { return getmacuid_r(h, 0); })), "root:3:8:200:24", ""},
		{"getmacent_r (walk)", record(mac(second_of_walk(setmacent_r, getmacent_r, endmacent_r))),
		 "alice:0:16:3:0", ""},
		{"putlevent_r", write(db, "levels", lev([&](void *h) { return putlevent_r(h, &new_lev); })),
		 levels + "restricted:5\n", levels, false},
		{"rmlevnam_r", write(db, "levels", lev([](void *h) { return rmlevnam_r(h, "secret"); })),
		 "unclassified:0\ntop:200\n", levels},
		{"rmlevval_r", write(db, "levels", lev([](void *h) { return rmlevval_r(h, 200); })),
		 "unclassified:0\nsecret:3\n", levels},
		{"putcatent_r", write(db, "categories", cat([&](void *h) { return putcatent_r(h, &new_cat); })),
		 cats + "legal:20\n", cats, false},
		{"rmcatnam_r", write(db, "categories", cat([](void *h) { return rmcatnam_r(h, "human"); })),
		 "finance:8\nops:100000000\n", cats},
		{"rmcatval_r", write(db, "categories", cat([](void *h) { return rmcatval_r(h, 8); })),
		 "human:10\nops:100000000\n", cats},
		{"putmacent_r", write(db, "users", mac([&](void *h) { return putmacent_r(h, &new_user); })),
		 users + "bob:1:8:2:10\n", users, false},
		{"rmmacnam_r", write(db, "users", mac([](void *h) { return rmmacnam_r(h, "root"); })),
		 "alice:0:10:3:0\n", users},
	};
	for (const Row &row : rows)
		sweep(row);
}

// The wide layer's own rules under memory shortage: an entry whose name
// can't be made wide comes back without a name, and an entry that can't be
// copied for the way in is dropped with the result 0.
TEST_F(AllocSweep, WideLayer)
{
	const ScratchDb &db = *db_;
	const std::string cats = ScratchDb::kCategories, users = ScratchDb::kUsers;
	wchar_t legal[] = L"legal";
	wchar_t bob[] = L"bob";
	const wccatent_t new_cat{legal, 0x20};
	const wcmacent_t new_user{bob, 1, 0x8, 2, 0x10};

	const Row rows[] = {
		{"wcgetlevent (walk)", record(lev(second_of_walk(wcsetlevent, wcgetlevent, wcendlevent))), "secret:3", "",
		 true, {"(null):3"}},
		{"wcgetlevnam", record(lev([](void *h) { return wcgetlevnam(h, L"top"); })), "top:200", "", true,
		 {"(null):200"}},
		{"wcgetcatent (walk)", record(cat(second_of_walk(wcsetcatent, wcgetcatent, wcendcatent))), "human:16", "",
		 true, {"(null):16"}},
		{"wcgetcatval", record(cat([](void *h) { return wcgetcatval(h, 8); })), "finance:8", "", true,
		 {"(null):8"}},
		{"wcgetcatnam", record(cat([](void *h) { return wcgetcatnam(h, L"ops"); })), "ops:4294967296", "",
		 true, {"(null):4294967296"}},
		{"wcgetmacnam", record(mac([](void *h) { return wcgetmacnam(h, L"alice"); })), "alice:0:16:3:0", "",
		 true, {"(null):0:16:3:0"}},
		{"wcputcatent", write(db, "categories", cat([&](void *h) { return wcputcatent(h, &new_cat); })),
		 cats + "legal:20\n", cats, false, {cats}},
		{"wcrmcatnam", write(db, "categories", cat([](void *h) { return wcrmcatnam(h, L"finance"); })),
		 "human:10\nops:100000000\n", cats},
		{"wcrmcatval", write(db, "categories", cat([](void *h) { return wcrmcatval(h, 0x10); })),
		 "finance:8\nops:100000000\n", cats},
		{"wcputmacent", write(db, "users", mac([&](void *h) { return wcputmacent(h, &new_user); })),
		 users + "bob:1:8:2:10\n", users, false, {users}},
		{"wcrmmacnam", write(db, "users", mac([](void *h) { return wcrmmacnam(h, L"alice"); })),
		 "root:3:8:200:18\n", users},
	};
	for (const Row &row : rows)
		sweep(row);
}

TEST_F(AllocSweep, StaticLayer)
{
	const ScratchDb &db = *db_;
	const std::string levels = ScratchDb::kLevels, cats = ScratchDb::kCategories;
	const Row rows[] = {
		{"rmlevnam", write(db, "levels", [] { return rmlevnam("top"); }), "unclassified:0\nsecret:3\n", levels},
		{"rmcatnam", write(db, "categories", [] { return rmcatnam("ops"); }), "finance:8\nhuman:10\n", cats},
		{"getlevnam", static_record([] { return getlevnam("top"); }), "top:200", ""},
		{"getcatval", static_record([] { return getcatval(0x10); }), "human:16", ""},
		{"getmacnam", static_record([] { return getmacnam("root"); }), "root:3:8:200:24", ""},
		{"setmacent+getmacent", static_record([] {
			 macent_t *e = setmacent() == 0 ? getmacent() : nullptr;
			 const int saved = errno;
			 endmacent();
			 errno = saved;
			 return e;
		 }),
		 "root:3:8:200:24", ""},
		{"getcatent+endcatent", static_record([] {
			 catent_t *e = getcatent();
			 const int saved = errno;
			 endcatent();
			 errno = saved;
			 return e;
		 }),
		 "finance:8", ""},
	};
	for (const Row &row : rows)
		sweep(row);
}

// Stream readers and writers of the static and wide layers. A reader's text
// is its first two records (behind a comment or a blank line); a writer's,
// the file it wrote.
TEST_F(AllocSweep, StreamLayers)
{
	const ScratchDb &db = *db_;
	install_file(db.path("stream-levels"), "# levels\nsecret:3\ntop:200\n");
	install_file(db.path("stream-cats"), "\nfinance:8\nhuman:10\n");
	const levent_t lev_rec{const_cast<char *>("secret"), 3};
	const catent_t cat_rec{const_cast<char *>("human"), 0x10};
	wchar_t top[] = L"top";
	wchar_t ops[] = L"ops";
	const wclevent_t wlev{top, 200};
	const wccatent_t wcat{ops, 0x100000000};

	// Reads two records; the wide ones are the caller's to free.
	auto take2 = [](auto get) {
		// The static layer's records are the library's; all others the caller's.
		const bool static_result = reinterpret_cast<void *>(get) == reinterpret_cast<void *>(fgetlevent) ||
		                           reinterpret_cast<void *>(get) == reinterpret_cast<void *>(fgetcatent);
		return [get, static_result](FILE *fp, char *buf, size_t n) {
			for (int i = 0; i < 2; ++i) {
				auto *e = get(fp);
				if (e == nullptr) {
					buf[0] = '\0';
					return false;
				}
				describe(buf, n, *e);
				if (!static_result)
					release(e);
			}
			return true;
		};
	};
	auto put = [](auto putter, const auto &rec) {
		return [putter, &rec](FILE *fp, char *, size_t) { return putter(fp, &rec) >= 0; }; // a byte count
	};

	const Row rows[] = {
		{"fgetlevent", stream(db, "stream-levels", "r", take2(fgetlevent)), "secret:3|top:200", ""},
		{"fgetcatent", stream(db, "stream-cats", "r", take2(fgetcatent)), "finance:8|human:16", ""},
		{"fgetcatent_r", stream(db, "stream-cats", "r", take2(fgetcatent_r)), "finance:8|human:16", ""},
		{"wcfgetlevent", stream(db, "stream-levels", "r", take2(wcfgetlevent)), "secret:3|top:200", "", true,
		 {"(null):3|top:200", "secret:3|(null):200"}},
		{"wcfgetcatent", stream(db, "stream-cats", "r", take2(wcfgetcatent)), "finance:8|human:16", "", true,
		 {"(null):8|human:16", "finance:8|(null):16"}},
		{"fputlevent", stream(db, "out", "w", put(fputlevent, lev_rec)), "secret:3\n", ""},
		{"fputcatent", stream(db, "out", "w", put(fputcatent, cat_rec)), "human:10\n", ""},
		// Without memory for the narrow copy, the wide writers write nothing
		// and return 0.
		{"wcfputlevent", stream(db, "out", "w", put(wcfputlevent, wlev)), "top:200\n", "", false, {""}},
		{"wcfputcatent", stream(db, "out", "w", put(wcfputcatent, wcat)), "ops:100000000\n", "", false, {""}},
	};
	for (const Row &row : rows)
		sweep(row);
}

// A string builder whose obstack can't get its first chunk ends in
// obstack_alloc_failed_handler; the guard jumps back from there, and the
// attempt counts as a failure (nothing of the call is alive yet then).
char *guarded_string(char *(*build)())
{
	bool aborted = false;
	char *s = vyr_test::obstack_guarded(build, &aborted);
	if (aborted)
		errno = ENOMEM;
	return s;
}

TEST_F(AllocSweep, RecordsAndStrings)
{
	auto string_of = [](char *(*build)()) {
		return [build](vyr_test::Injector &inj) {
			int err = 0;
			char *s = injected(inj, [&] { return guarded_string(build); }, err);
			Outcome o{s != nullptr, s ? 0 : err, s ? s : ""};
			std::free(s);
			return o;
		};
	};
	const Row rows[] = {
		{"vyrml_get_new_init", [](vyr_test::Injector &inj) {
			 int err = 0;
			 vyrml_t *ml = injected(inj, [] { return vyrml_get_new_init(3, 1, 0x8, 5); }, err);
			 if (ml == nullptr)
				 return Outcome{false, err, ""};
			 Outcome o{true, 0, std::to_string(ml->lev) + ":" + std::to_string(ml->ilev) + ":" +
			                        std::to_string(ml->cat) + ":" + std::to_string(ml->type) + ":" +
			                        std::to_string(vyrml_ucnt(ml))};
			 vyrml_put(ml);
			 return o;
		 },
		 "3:1:8:5:1", ""},
		{"vyrrl_asprintf", string_of([] {
			 vyr_role_t r1[] = {{9, 0, 0}, {4, 0, 0}};
			 vyr_role_t r2[] = {{7, 0, 0}};
			 vyrrl_t rl{2, 1, r1, r2, 1};
			 return vyrrl_asprintf(&rl, "<%r>");
		 }),
		 "<9,4:7>", ""},
	};
	for (const Row &row : rows)
		sweep(row);
}

// Text calls that look names up. A failed lookup is no failure for them:
// writers then write the number and readers read the token as a number, so
// under allocation failure they may give a different (numeric) answer. The
// rows below pin what must hold: no leak, and either the named answer, the
// numeric fallback, or a failure with ENOMEM.
TEST_F(AllocSweep, TextWithNames)
{
	struct TextRow {
		const char *what;
		Attempt attempt;
		std::vector<std::string> allowed; // first: the answer with every allocation served
	};
	const TextRow rows[] = {
		{"vyr_lev_from_text", field<uint8_t>([](uint8_t *v) { return vyr_lev_from_text("top", v); }), {"200"}},
		{"vyr_cat_from_text_nc", field<uint64_t>([](uint64_t *v) {
			 static char text[32];
			 std::strcpy(text, "finance,human,1");
			 return vyr_cat_from_text_nc(text, v);
		 }),
		 {"25"}},
		{"vyr_lev_obstack", obstack_text([](struct obstack *o) { return vyr_lev_obstack(3, o, 0); }),
		 {"secret", "3"}},
		{"vyr_cat_obstack", obstack_text([](struct obstack *o) { return vyr_cat_obstack(0x19, o, 0); }),
		 {"finance,human,0x1", "finance,0x11", "0x19"}},
		{"vyrl_obstack", obstack_text([](struct obstack *o) {
			 vyr_role_t r1[] = {{9, 0, 0}, {4, 0, 0}};
			 vyrml_t ml{3, 1, 0x8, 1, 0, nullptr, 1};
			 vyrrl_t rl{2, 0, r1, nullptr, 1};
			 vyrl_t l{&ml, &rl, 1};
			 return vyrl_obstack(&l, o, 0);
		 }),
		 {"secret:High:finance:ccnr!9,4:No", "3:High:finance:ccnr!9,4:No", "secret:High:0x8:ccnr!9,4:No",
		  "3:High:0x8:ccnr!9,4:No"}},
		{"vyrl_obstack_printf", obstack_text([](struct obstack *o) {
			 vyr_role_t r2[] = {{7, 0, 0}};
			 vyrml_t ml{0, 0, 0x100000000, 0, 0, nullptr, 1};
			 vyrrl_t rl{0, 1, nullptr, r2, 1};
			 vyrl_t l{&ml, &rl, 1};
			 return vyrl_obstack_printf(&l, o, "%c/%Nr");
		 }),
		 {"ops/:7", "0x100000000/:7"}},
		{"vyrml_obstack_printf", obstack_text([](struct obstack *o) {
			 vyrml_t ml{200, 0, 0x10, 0, 0, nullptr, 1};
			 return vyrml_obstack_printf(&ml, o, "<%l|%c>");
		 }),
		 {"<top|human>", "<200|human>", "<top|0x10>", "<200|0x10>"}},
	};
	for (const TextRow &row : rows) {
		SCOPED_TRACE(row.what);
		const long attempts = vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			const Outcome o = row.attempt(inj);
			if (!inj.fired()) {
				EXPECT_TRUE(o.ok);
				EXPECT_EQ(o.text, row.allowed.front());
				return;
			}
			if (!o.ok) {
				EXPECT_EQ(o.err, ENOMEM) << "failing allocation " << inj.n();
				return;
			}
			EXPECT_NE(std::find(row.allowed.begin(), row.allowed.end(), o.text), row.allowed.end())
			    << o.text << " with allocation " << inj.n() << " failing";
		});
		EXPECT_GT(attempts, 1) << "the call allocated nothing";
	}
}

} // namespace
} // namespace hardening
