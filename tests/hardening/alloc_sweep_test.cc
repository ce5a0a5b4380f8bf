// Allocation failure end to end through the database switch and the files
// back-end, and in the one record builder no other test sweeps: with each
// allocation failing in turn, a call fails whole (NULL or -1, ENOMEM, the
// database file untouched) or copes and answers right, and nothing leaks.
#include <vyr/label.h>
#include <vyr/namedb.h>

#include "hardening/files_db.hh"
#include "support/failalloc.h"

#include <cerrno>
#include <functional>
#include <pwd.h>
#include <string>

namespace hardening {
namespace {

using vyr_test::Injector;

void *g_lev = nullptr, *g_cat = nullptr, *g_mac = nullptr;

std::string show(const levent_t &e) { return std::string(e.name) + ":" + std::to_string(e.value); }
std::string show(const catent_t &e) { return std::string(e.name) + ":" + std::to_string(e.value); }
std::string show(const macent_t &e)
{
	return std::string(e.name) + ":" + std::to_string(e.lev1) + ":" + std::to_string(e.cat1) + ":" +
	       std::to_string(e.lev2) + ":" + std::to_string(e.cat2);
}
void release(levent_t *e) { freelevent_r(e); }
void release(catent_t *e) { freecatent_r(e); }
void release(macent_t *e) { freemacent_r(e); }

// What one attempt gave: the record, or the database file after a write.
struct Outcome {
	bool ok;
	int err;
	std::string text;
};

struct Row {
	const char *what;
	std::function<Outcome(Injector &)> attempt;
	std::string answer; // with every allocation served
	// Puts: without memory for its copy the switch hands the back-end NULL.
	bool enomem = true;
};

// Runs call() in the injected window and keeps its errno.
template <class Call>
auto injected(Injector &inj, Call call, int &err)
{
	return inj.run([&] {
		errno = 0;
		auto r = call();
		err = errno;
		return r;
	});
}

// A record, the caller's unless Owned is false. A first call before the
// window brings the back-end's file cache up to date, so nothing allocated
// in the window is rightly kept.
template <bool Owned = true, class Call>
std::function<Outcome(Injector &)> record(Call call)
{
	return [call](Injector &inj) {
		if (auto *warm = call(); warm && Owned)
			release(warm);
		int err = 0;
		auto *r = injected(inj, call, err);
		if (r == nullptr)
			return Outcome{false, err, ""};
		Outcome o{true, 0, show(*r)};
		if constexpr (Owned)
			release(r);
		return o;
	};
}

// A write to a database file: the text is the file afterwards (none when a
// failed write left it as it was), which is then put back.
template <class Call>
std::function<Outcome(Injector &)> write(const char *file, Call call)
{
	return [file, call](Injector &inj) {
		const std::string path = scratch_db(file), before = read_file(path);
		int err = 0;
		const int rc = injected(inj, call, err);
		Outcome o{rc == 0, err, read_file(path)};
		if (rc != 0 && o.text == before)
			o.text.clear();
		install_file(path, before);
		return o;
	};
}

class AllocSweep : public ::testing::Test {
protected:
	// Kept for the life of the process, so not made in a sweep: the started
	// databases, and glibc's user database module (loaded on a missed uid).
	static void SetUpTestSuite()
	{
		scratch_db("");
		::getpwnam("vyr-hardening-no-such-user");
		g_lev = openlevdb_r(), g_cat = opencatdb_r(), g_mac = openmacdb_r();
		ASSERT_TRUE(g_lev && g_cat && g_mac);
	}
	static void TearDownTestSuite() { closelevdb_r(g_lev), closecatdb_r(g_cat), closemacdb_r(g_mac); }
};

TEST_F(AllocSweep, CallsFailWholeAndLeakNothing)
{
	const macent_t bob{const_cast<char *>("bob"), 1, 0x8, 2, 0x10};
	const Row rows[] = {
		{"getlevnam_r", record([] { return getlevnam_r(g_lev, "secret"); }), "secret:3"},
		{"getcatval_r", record([] { return getcatval_r(g_cat, 0x100000000); }), "ops:4294967296"},
		{"getmacuid_r", record([] { return getmacuid_r(g_mac, 0); }), "root:3:8:200:24"},
		{"getmacnam (static)", record<false>([] { return getmacnam("alice"); }), "alice:0:16:3:0"},
		{"putmacent_r", write("users", [&] { return putmacent_r(g_mac, &bob); }), std::string(kUsers) + "bob:1:8:2:10\n",
		 false},
		{"rmcatnam_r", write("categories", [] { return rmcatnam_r(g_cat, "human"); }),
		 "finance:8\nops:100000000\n"},
		{"vyrml_get_new_init", [](Injector &inj) {
			 int err = 0;
			 vyrml_t *ml = injected(inj, [] { return vyrml_get_new_init(3, 1, 0x8, 5); }, err);
			 const vyrml_t want{3, 1, 0x8, 5, 0, nullptr, 1};
			 Outcome o{ml != nullptr, err, ml && vyrml_cmp(ml, &want) == 1 && vyrml_ucnt(ml) == 1 ? "3:1:8:5" : ""};
			 if (ml != nullptr)
				 vyrml_put(ml);
			 return o;
		 },
		 "3:1:8:5"},
	};
	for (const Row &row : rows) {
		SCOPED_TRACE(row.what);
		const long attempts = vyr_test::sweep_alloc_failures([&](Injector &inj) {
			const Outcome o = row.attempt(inj);
			if (!inj.fired()) {
				EXPECT_TRUE(o.ok) << "errno " << o.err;
				EXPECT_EQ(o.text, row.answer);
				return;
			}
			EXPECT_EQ(o.text, o.ok ? row.answer : "") << "failing allocation " << inj.n();
			EXPECT_TRUE(o.ok || !row.enomem || o.err == ENOMEM) << "errno " << o.err << ", failing allocation " << inj.n();
		});
		EXPECT_GT(attempts, 1) << "the call allocated nothing";
	}
}

} // namespace
} // namespace hardening
