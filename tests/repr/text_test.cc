// Label text writers, format engine and readers: documented texts, round
// trips, database work and allocation failure, on the in-memory back-end;
// with TEXT_TEST_FILES only the round trips, on the real `files` back-end.
#include <vyr/label.h>
#include <vyr/namedb.h>
#include <vyr/text.h>

#include "support/failalloc.h"
#include "support/labels.hh"
#include "support/obstack_guard.hh"
#include "support/scratch_dir.hh"
#ifndef TEXT_TEST_FILES
#include "support/memdb/textmem.h"
#endif

#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>
#include <fstream>
#include <functional>
#include <langinfo.h>
#include <obstack.h>
#include <random>
#include <sstream>
#include <string_view>

namespace {

using vyr_test::Injector;

struct LevelName { const char *name; uint8_t value; };
struct CategoryName { const char *name; uint64_t value; };

// Level 2 has no name, and "12" names level 7, so 12 can't be read as a level.
constexpr LevelName kLevels[] = {{"public", 0}, {"secret", 5}, {"12", 7}, {"top", 255}};
// In walk order. "pair" loses bit 0x2 to the earlier "beta", "wide" (two
// bits) comes before "eps", "face" also spells a number, nothing names 0x8 or 0.
constexpr CategoryName kCategories[] = {{"alpha", 0x1}, {"beta", 0x2}, {"pair", 0x6},
                                        {"wide", 0x30}, {"eps", 0x20}, {"face", 0x100}};

// Low, High, No and ":No" as the test translation (domain "vyr", LC_MESSAGES
// only) gives them; nullptr keeps a word. Each test starts with none.
struct Words { const char *low, *high, *no, *colon_no; };
constexpr Words kGerman = {"Niedrig", "Hoch", "Nein", ":Nein"}, kOdd = {"%s%%", "H!gh:1", "Aucun", "|aucun"};
const Words *g_words = nullptr;
void set_translation(const Words *words) { g_words = words; }

std::string take(char *s) { std::string r = s ? s : "<null>"; std::free(s); return r; }
// A writable copy of a text, NUL included; chars() gives NULL back for NULL.
std::vector<char> buffer(const char *t) { return t ? std::vector<char>(t, t + std::strlen(t) + 1) : std::vector<char>{}; }

// Points the databases at the back-end, in the locale's charset (no name is
// converted), and opens each once: the first open loads its plug-in for good.
bool start_databases()
{
	static const vyr_test::ScratchDir dir;
	{
		std::ofstream conf(dir / "dbroute.conf");
#ifdef TEXT_TEST_FILES
		std::ofstream levels(dir / "levels"), cats(dir / "categories");
		for (const LevelName &l : kLevels) levels << l.name << ':' << unsigned{l.value} << '\n';
		for (const CategoryName &c : kCategories) cats << c.name << ':' << std::hex << c.value << '\n';
		const char *backend = "files";
		conf << "files_dir = " << dir.path() << '\n';
#else
		const char *backend = "textmem";
#endif
		const char *cs = nl_langinfo(CODESET);
		conf << "lev_backend = " << backend << "\nlev_charset = " << cs << "\ncat_backend = " << backend
		     << "\ncat_charset = " << cs << '\n';
	}
	setenv("VYR_DBROUTE_CONF", (dir / "dbroute.conf").c_str(), 1);
	void *lev = openlevdb_r(), *cat = opencatdb_r();
	if (lev) closelevdb_r(lev);
	if (cat) closecatdb_r(cat);
	return lev && cat;
}

// Asserted in SetUp (in SetUpTestSuite it would only skip); names reloaded per test.
class TextTest : public ::testing::Test {
protected:
	void SetUp() override
	{
		static const bool started = start_databases();
		ASSERT_TRUE(started) << "the test back-end did not start";
#ifndef TEXT_TEST_FILES
		textmem_reset();
		for (const LevelName &l : kLevels) textmem_add_level(l.name, l.value);
		for (const CategoryName &c : kCategories) textmem_add_category(c.name, c.value);
#endif
	}
	void TearDown() override { set_translation(nullptr); }
};

vyr_test::Label make_label(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type, std::vector<vyr_role_t> r1 = {},
                           std::vector<vyr_role_t> r2 = {})
{
	return vyr_test::Label(vyrl_get_new_init_mac_roles(lev, ilev, cat, type, r1.data(), uint32_t(r1.size()), r2.data(),
	                                                   uint32_t(r2.size())));
}

struct Fields { uint8_t lev, ilev; uint64_t cat; uint16_t type; std::vector<vyr_role_t> r1, r2; };

// Mostly values that have names and their neighbours, sometimes anything;
// role ids small with duplicates, negative as text, or anything.
Fields random_fields(std::mt19937_64 &rng)
{
	Fields f{};
	f.lev = uint8_t(rng() % 2 ? rng() : kLevels[rng() % std::size(kLevels)].value + rng() % 3 - 1);
	f.ilev = uint8_t(rng() % 3 == 0 ? rng() : rng() % 2);
	for (const CategoryName &c : kCategories)
		f.cat |= rng() % 2 ? c.value : 0;
	f.cat = rng() % 4 == 0 ? 0 : rng() % 2 ? f.cat | 1ull << (rng() % 64) : rng();
	f.type = uint16_t(rng() % 2 ? rng() : rng() % 32);
	for (auto *list : {&f.r1, &f.r2})
		for (size_t n = rng() % 6; n > 0; --n)
			list->push_back({rng() % 4 == 0 ? rng() % 4 : rng() % 3 == 0 ? ~0ull - rng() % 2 : rng(), uint32_t(rng()), uint8_t(rng())});
	return f;
}

// What doesn't survive: a level number that is also a level name reads as
// that name; a type of bit names and a remainder keeps the remainder.
void round_trip(int flags, int labels, uint64_t seed)
{
	std::mt19937_64 rng(seed);
	for (int i = 0; i < labels; ++i) {
		Fields f = random_fields(rng);
		vyr_test::Label label = make_label(f.lev, f.ilev, f.cat, f.type, f.r1, f.r2);
		if (i % 3 == 0)  // a blob goes along, and is dropped
			label->ml->blob = static_cast<unsigned char *>(std::calloc(label->ml->blob_size = 4, 1));
		for (const LevelName &l : kLevels)
			f.lev = std::to_string(f.lev) == l.name ? l.value : f.lev;
		if (!(flags & VYR_TEXT_NUMERIC) && f.type != 3 && f.type != 7 && (f.type & 7) != 0 && (f.type & ~7) != 0)
			f.type &= ~7;
		for (vyr_role_t &r : f.r1) r.attr = r.rights = 0;
		for (vyr_role_t &r : f.r2) r.attr = r.rights = 0;
		const vyr_test::Label expected = make_label(f.lev, f.ilev, f.cat, f.type, f.r1, f.r2);
		const std::string text = take(vyrl_get_text(label.get(), flags));
		SCOPED_TRACE(testing::Message() << "flags " << flags << ": \"" << text << "\", expected "
		                                << take(vyrl_get_text(expected.get(), VYR_TEXT_NUMERIC)));
		std::vector<char> b = buffer(text.c_str());
		vyr_test::Label copied(vyrl_get_from_text(text.c_str())), in_place(vyrl_get_from_text_nc(b.data()));
		ASSERT_TRUE(copied && in_place);
		EXPECT_EQ(vyrl_cmp(copied.get(), expected.get(), 0) + vyrl_cmp(in_place.get(), expected.get(), 0), 2)
			<< take(vyrl_get_text(copied.get(), VYR_TEXT_NUMERIC));
	}
}

TEST_F(TextTest, RoundTripsUnderEveryFlagWord)
{
	round_trip(0, 400, 1);
	round_trip(VYR_TEXT_NUMERIC, 300, 2);
	round_trip(VYR_TEXT_OMIT_ZERO, 200, 3);
	set_translation(&kGerman);
	round_trip(0, 200, 5);
}

#ifndef TEXT_TEST_FILES
void *chunk_malloc(long n) { return std::malloc(static_cast<size_t>(n)); }

// A caller's obstack; text() is the object being built, as it stands.
struct Obstack {
	struct obstack o;
	Obstack() { _obstack_begin(&o, 0, 0, chunk_malloc, std::free); }
	~Obstack() { obstack_free(&o, nullptr); }
	struct obstack *get() { return &o; }
	std::string text() { return std::string(static_cast<const char *>(obstack_base(&o)), obstack_object_size(&o)); }
};

constexpr int N = VYR_TEXT_NUMERIC, R = VYR_TEXT_NAMED_ONLY, Z = VYR_TEXT_OMIT_ZERO;
textmem_stats stats() { return textmem_get_stats(); }
char *chars(std::vector<char> &b) { return b.empty() ? nullptr : b.data(); }

// Roles with bare ids (attr and rights 0), or none when !on.
std::vector<vyr_role_t> ids(std::initializer_list<uint64_t> list, bool on = true)
{
	std::vector<vyr_role_t> roles;
	for (uint64_t id : list) if (on) roles.push_back({id, 0, 0});
	return roles;
}

// A writer's result on a fresh obstack: the text, or "-1:" and the text it
// left behind before failing. The count returned must match the text.
template <class Writer>
std::string written(Writer &&w)
{
	Obstack o;
	const int rc = w(o.get());
	EXPECT_TRUE(rc < 0 || rc == static_cast<int>(o.text().size())) << o.text();
	return (rc < 0 ? "-1:" : "") + o.text();
}

// A builder's text, or "<null>", swept for allocation failure: nothing may
// leak, the obstack handler may be reached once (its first chunk), and the
// final copy failing must give NULL.
std::string built(const std::function<char *()> &call)
{
	std::string text;
	int aborted = 0, nulls = 0;
	vyr_test::sweep_alloc_failures([&](Injector &inj) {
		bool jumped = false;
		char *s = inj.run([&] { return vyr_test::obstack_guarded(call, &jumped); });
		aborted += jumped, nulls += inj.fired() && !jumped && !s;
		(inj.fired() ? std::free(s) : void(text = take(s)));
	});
	EXPECT_TRUE(aborted <= 1 && (text == "<null>" || nulls >= 1)) << text;
	return text;
}

// Label: lev 5 (secret), ilev 1, cat 0x3 (alpha,beta), type 3, roles 2,1:3.
TEST_F(TextTest, EngineDirectives)
{
	const struct { const char *format; int arg; const char *text; } rows[] = {  // arg: for F only
		{"", 0, ""}, {"\xc3\xa9t %t", 0, "\xc3\xa9t CCNRA"}, {"100%%", 0, "100%"}, {"end%", 0, "end"},
		{"%-007l|%12t|%-3i", 0, "secret|CCNRA|High"},  // width and justification ignored
		{"[%x%Q]", 0, "[]"}, {"%-%", 0, ""},           // unknown letters swallowed
		{"%NF%F%Gi", 1, "1"}, {"%NNl", 0, "l"},  // F behind a flag is unknown, NN ends the directive
		{"%NRNl", 0, "5"}, {"%Gl", 0, "secret"}, {"%Gl%F%Gl", 1, "secret5"}, {"%-03F%Gl", 1, "5"},
		{"%F%Nl %l", 1, "5 secret"}, {"%F%GZl", 1, "5"},  // the stored word counts only behind G
		{"%l|%i|%c|%t|%r", 0, "secret|High|alpha,beta|CCNRA|2,1:3"}, {"%Nl|%Ni|%Nc|%Nt|%Nr", 0, "5|1|0x3|0x3|2,1:3"},
		{"%m", 0, "secret:High:alpha,beta:CCNRA"}, {"%F%Gm!%Gr", 1, "5:1:0x3:0x3!2,1:3"},
		{"a%-", 0, "a"}, {"a%007", 0, "a"}, {"a%GZR", 0, "a"},  // a format ending inside a directive
	};
	auto lab = make_label(5, 1, 0x3, 3, ids({2, 1}), ids({3}));
	for (const auto &r : rows) {
		SCOPED_TRACE(r.format);
		Obstack o;
		obstack_grow(o.get(), "<", 1);  // text already on the caller's obstack stays and isn't counted
		EXPECT_EQ(vyrl_obstack_printf(lab.get(), o.get(), r.format, r.arg), static_cast<int>(std::strlen(r.text)));
		EXPECT_EQ(o.text(), std::string("<") + r.text);
		EXPECT_EQ(built([&] { return vyrl_asprintf(lab.get(), r.format, r.arg); }), r.text);
	}
	// The part forms hand the engine their part; the engine stops at the first failure.
	auto two = make_label(2, 0, 0x8, 1, ids({7}));  // level 2 and bit 0x8 have no names
	EXPECT_EQ(written([&](obstack *o) { return vyrrl_obstack_printf(two->rl, o, "(%r)(%Nr)"); }), "(7:No)(7:)");
	EXPECT_EQ(take(vyrrl_asprintf(two->rl, "<%Zr>")), "<7>");
	EXPECT_EQ(written([&](obstack *o) { return vyrml_obstack_printf(two->ml, o, "%l:%Rc:%t"); }), "-1:2:");
	EXPECT_EQ(take(vyrml_asprintf(two->ml, "%F%Gm", R)), "<null>");
}

enum Field { Lev, Ilev, Cat, Type };
const struct { int (*obstack)(uint64_t, struct obstack *, int); char *(*get_text)(uint64_t, int); } kWriters[] = {
	{[](uint64_t v, obstack *o, int f) { return vyr_lev_obstack(uint8_t(v), o, f); }, [](uint64_t v, int f) { return vyr_lev_get_text(uint8_t(v), f); }},
	{[](uint64_t v, obstack *o, int f) { return vyr_ilev_obstack(uint8_t(v), o, f); }, [](uint64_t v, int f) { return vyr_ilev_get_text(uint8_t(v), f); }},
	{vyr_cat_obstack, vyr_cat_get_text},
	{[](uint64_t v, obstack *o, int f) { return vyr_type_obstack(uint16_t(v), o, f); }, [](uint64_t v, int f) { return vyr_type_get_text(uint16_t(v), f); }},
};

// Each field writer in its obstack and its get_text form. A level is looked
// up once per conversion and a category walked once, with every open closed.
TEST_F(TextTest, Fields)
{
	const struct {
		Field field; uint64_t value; int flags;
		const char *obstack;             // "-1:" and the text left behind on failure
		const char *get_text = nullptr;  // if other than the obstack's text (or NULL)
	} rows[] = {
		{Lev, 5, 0, "secret"}, {Lev, 5, N, "5", "secret"}, {Lev, 2, 0, "2", "<null>"}, {Lev, 2, N, "2"}, {Lev, 2, Z, "2"},
		{Lev, 2, R, "-1:", "2"}, {Lev, 0, 0, "public"}, {Lev, 0, Z, ""}, {Lev, 0, Z | R, ""},
		{Lev, 2, 0x100, "2"},  // unknown flag bits are ignored, but get_text is NULL for exactly 0
		{Ilev, 0, 0, "Low"}, {Ilev, 0, N, "0", "Low"}, {Ilev, 1, N, "1", "High"}, {Ilev, 1, Z, "High"},
		{Ilev, 2, 0, "2"}, {Ilev, 2, R, "-1:"}, {Ilev, 2, N | R, "2", "<null>"},
		{Cat, 0x3, 0, "alpha,beta"}, {Cat, 0x6, 0, "beta,0x4"},  // pair lost bit 0x2 to the earlier beta
		{Cat, 0x30, 0, "wide"},  // an earlier entry of two bits wins over a later one
		{Cat, 0x9, 0, "alpha,0x8"}, {Cat, ~0ull, 0, "alpha,beta,wide,face,0xfffffffffffffecc"}, {Cat, 0x0, 0, "0x0"},
		{Cat, 0x9, R, "-1:alpha"}, {Cat, 0x0, R, "-1:"}, {Cat, 0x3, N, "0x3"}, {Cat, 0x9, N | R, "0x9"},
		{Type, 3, 0, "CCNRA"}, {Type, 7, 0, "ALL"}, {Type, 5, 0, "ccnr,ehole"}, {Type, 6, 0, "ccnri,ehole"},
		{Type, 0, 0, "0x0"}, {Type, 9, 0, "ccnr,0x8"}, {Type, 16, 0, "0x10"}, {Type, 3, N, "0x3"}, {Type, 16, R | Z, "0x10"},
		{Type, 0xb, 0, "ccnr,ccnri,0x8"},  // 3 and another bit is no composite
	};
	for (const auto &r : rows) {
		SCOPED_TRACE(testing::Message() << "field " << r.field << " value " << r.value << " flags " << r.flags);
		textmem_clear_stats();
		EXPECT_EQ(written([&](obstack *o) { return kWriters[r.field].obstack(r.value, o, r.flags); }), r.obstack);
		const bool by_name = !(r.flags & N) && !(r.value == 0 && (r.flags & Z));
		EXPECT_EQ(stats().cat_opens + stats().lev_lookups * 10, by_name ? r.field == Cat ? 1 : r.field == Lev ? 10 : 0 : 0);
		EXPECT_EQ(stats().cat_closes + stats().lev_closes, stats().cat_opens + stats().lev_opens);
		const bool failed = std::strncmp(r.obstack, "-1:", 3) == 0;
		EXPECT_EQ(built([&] { return kWriters[r.field].get_text(r.value, r.flags); }), r.get_text ? r.get_text : failed ? "<null>" : r.obstack);
	}
}

// Mask 0 is looked up as a value; in a walk a 0 entry claims nothing. The walk
// stops once all bits are named; one that can't start fails. Without its
// database a level fails unless numeric or left out; a category gives the mask.
TEST_F(TextTest, CategoryWalkAndMissingDatabases)
{
	EXPECT_EQ(written([](obstack *o) { return vyr_cat_obstack(0x3, o, 0); }), "alpha,beta");
	EXPECT_EQ(stats().cat_nexts * 10 + stats().cat_sets + stats().cat_ends + stats().cat_opens + stats().cat_closes, 24);
	textmem_add_category("nothing", 0x0);
	EXPECT_EQ(written([](obstack *o) { return vyr_cat_obstack(0, o, R); }) + written([](obstack *o) { return vyr_cat_obstack(0, o, N); }) +
	          written([](obstack *o) { return vyr_cat_obstack(0x1, o, 0); }), "nothing0x0alpha");
	textmem_set_catset_result(-1);
	EXPECT_EQ(written([](obstack *o) { return vyr_cat_obstack(0x3, o, 0); }), "-1:");
	EXPECT_EQ(stats().cat_closes, stats().cat_opens);

	textmem_set_open_ok(false, false);
	EXPECT_EQ(written([](obstack *o) { return vyr_lev_obstack(2, o, Z); }), "-1:");
	EXPECT_EQ(written([](obstack *o) { return vyr_lev_obstack(5, o, N); }) + written([](obstack *o) { return vyr_lev_obstack(0, o, Z); }), "5");
	EXPECT_EQ(take(vyr_lev_get_text(5, N)) + take(vyr_lev_get_text(0, Z)), "<null>");
	EXPECT_EQ(written([](obstack *o) { return vyr_cat_obstack(0x9, o, 0); }) + written([](obstack *o) { return vyr_cat_obstack(0x9, o, R); }), "0x9-1:");
}

// Role parts (lists 2,1 and 3) and whole labels, in every writer form.
TEST_F(TextTest, RolePartsAndWholeLabels)
{
	const struct { bool first, second; int flags; const char *text; } role_rows[] = {
		{false, false, 0, "No:No"}, {false, false, N, ":"}, {false, false, Z, ""}, {false, false, N | Z, ":"},
		{true, false, 0, "2,1:No"}, {true, false, N, "2,1:"}, {true, false, Z, "2,1"},
		{false, true, 0, "No:3"}, {false, true, N, ":3"}, {false, true, Z, ":3"}, {true, true, Z, "2,1:3"},
	};
	for (const auto &r : role_rows) {
		auto lab = make_label(0, 0, 0, 0, ids({2, 1}, r.first), ids({3}, r.second));
		EXPECT_EQ(written([&](obstack *o) { return vyrrl_obstack(lab->rl, o, r.flags); }), r.text);
		EXPECT_EQ(built([&] { return vyrrl_get_text(lab->rl, r.flags); }), r.text);
	}
	auto big = make_label(0, 0, 0, 0, ids({UINT64_MAX, 0x8000000000000000ull, 12}), ids({0x7fffffffffffffffull}));
	EXPECT_EQ(take(vyrrl_get_text(big->rl, 0)), "-1,-9223372036854775808,12:9223372036854775807");  // signed

	const struct { uint8_t lev, ilev; uint64_t cat; uint16_t type; bool roles; int flags; const char *text; } rows[] = {
		{2, 1, 0, 0, false, 0, "2:High:0x0:0x0!No:No"}, {2, 1, 0, 0, false, N, "2:1:0x0:0x0!:"},
		{0, 0, 0, 3, false, Z, ":Low:0x0:CCNRA!"}, {5, 0, 0x3, 5, true, 0, "secret:Low:alpha,beta:ccnr,ehole!2,1:3"},
		{0, 1, 0x9, 7, true, Z, ":High:alpha,0x8:ALL!2,1:3"}, {5, 1, 0x3, 3, false, R, "secret:High:alpha,beta:CCNRA!No:No"},
	};
	for (const auto &r : rows) {
		auto lab = make_label(r.lev, r.ilev, r.cat, r.type, ids({2, 1}, r.roles), ids({3}, r.roles));
		const std::string text = r.text;
		EXPECT_EQ(built([&] { return vyrl_get_text(lab.get(), r.flags); }), text);
		EXPECT_EQ(built([&] { return vyrml_get_text(lab->ml, r.flags); }), text.substr(0, text.find('!')));
		EXPECT_EQ(written([&](obstack *o) { return vyrl_obstack(lab.get(), o, r.flags); }), text);
	}
	// On the caller's obstack the fields before a failure stay.
	auto partial = make_label(5, 1, 0x9, 3);
	EXPECT_EQ(written([&](obstack *o) { return vyrml_obstack(partial->ml, o, R); }), "-1:secret:High:alpha");
}

// Each use looks its word up afresh; translations are written as they
// stand; numbers and type names are never translated.
TEST_F(TextTest, FixedWordsAreTranslatedAtEachUse)
{
	auto lab = make_label(2, 0, 0, 0);
	set_translation(&kOdd);
	EXPECT_EQ(take(vyrl_get_text(lab.get(), 0)) + take(vyr_ilev_get_text(1, N)), "2:%s%%:0x0:0x0!Aucun|aucunH!gh:1");
	EXPECT_EQ(take(vyrl_get_text(lab.get(), N)) + take(vyr_type_get_text(3, 0)), "2:0:0x0:0x0!:CCNRA");
	set_translation(nullptr);
	EXPECT_EQ(take(vyrl_get_text(lab.get(), 0)), "2:Low:0x0:0x0!No:No");  // nothing kept
}

// A reader's result as a string: its value on success, "-1" on a failure
// that left the out value alone, "-1:" and the value on one that didn't.
template <class T>
std::string outcome(int rc, T value, T sentinel, bool hex = false)
{
	std::ostringstream s;
	s << (rc != 0 ? (value == sentinel ? "-1" : "-1:") : "") << (hex ? std::hex : std::dec);
	if (rc == 0 || value != sentinel)
		s << (hex ? "0x" : "") << uint64_t{value};
	return s.str();
}
std::string lev(const char *t) { uint8_t v = 0xaa; const int rc = vyr_lev_from_text(t, &v); return outcome(rc, v, uint8_t{0xaa}); }
std::string type(const char *t) { uint16_t v = 0x5a5a; const int rc = vyr_type_from_text(t, &v); return outcome(rc, v, uint16_t{0x5a5a}, true); }
std::string ilev(const char *t)  // a failure sets EINVAL
{
	uint8_t v = 0xaa;
	errno = 0;
	const int rc = vyr_ilev_from_text(t, &v);
	return outcome(rc, v, uint8_t{0xaa}) + (errno == EINVAL ? " EINVAL" : "");
}
// Both forms must agree; the copying one leaves the text alone. A stale
// ERANGE must not make all ones an overflow; a real one stays in errno.
std::string cat(const char *t)
{
	std::vector<char> b = buffer(t);
	uint64_t copied = 0x5555, in_place = 0x5555;
	errno = ERANGE;
	const int rc = vyr_cat_from_text(chars(b), &copied);
	EXPECT_EQ(b, buffer(t));
	errno = 0;
	EXPECT_EQ(vyr_cat_from_text_nc(chars(b), &in_place), rc);
	EXPECT_EQ(in_place, copied);
	return outcome(rc, copied, uint64_t{0x5555}, true) + (errno == ERANGE ? " ERANGE" : "");
}
// Both forms of a record reader, which must agree; the record is written
// back as numbers, or "<null>", and holds one reference of its own.
template <class Rec>
std::string record(const char *t, Rec *(*copying)(const char *), Rec *(*in_place)(char *), char *(*write)(const Rec *, int))
{
	std::vector<char> b = buffer(t);
	std::unique_ptr<Rec, vyr_test::LabelPut> a(copying(chars(b)));
	EXPECT_EQ(b, buffer(t)) << "the copying form changed the text";
	std::unique_ptr<Rec, vyr_test::LabelPut> c(in_place(chars(b)));
	EXPECT_TRUE((!a || a->ucnt == 1) && (!c || c->ucnt == 1));
	const std::string sa = a ? take(write(a.get(), N)) : "<null>";
	EXPECT_EQ(sa, c ? take(write(c.get(), N)) : "<null>") << "the two forms disagree";
	return sa;
}
std::string ml(const char *t) { return record(t, vyrml_get_from_text, vyrml_get_from_text_nc, vyrml_get_text); }
std::string rl(const char *t) { return record(t, vyrrl_get_from_text, vyrrl_get_from_text_nc, vyrrl_get_text); }
std::string whole(const char *t) { return record(t, vyrl_get_from_text, vyrl_get_from_text_nc, vyrl_get_text); }

// Every row also runs with allocations tracked: nothing may be left behind.
TEST_F(TextTest, Table)
{
	const struct { std::string (*read)(const char *); const char *text, *want; const Words *words = nullptr; } rows[] = {
		{lev, "secret", "5"}, {lev, "12", "7"},  // a name beats the number it spells
		{lev, "12abc", "12"}, {lev, "300", "44"}, {lev, "", "0"}, {lev, nullptr, "0"}, {lev, "x1", "-1"},
		{ilev, "Low", "0"}, {ilev, "High", "1"}, {ilev, "257", "1"}, {ilev, "", "0"}, {ilev, nullptr, "0"},
		{ilev, "low", "-1 EINVAL"}, {ilev, "Niedrig", "0", &kGerman}, {ilev, "Hoch", "1", &kGerman}, {ilev, "High", "1", &kGerman},
		{cat, "alpha,beta", "0x3"}, {cat, "face", "0x100"}, {cat, "beta,0x8", "0xa"}, {cat, ",,,", "0x0"}, {cat, "", "0x0"},
		{cat, nullptr, "0x0"}, {cat, "ffffffffffffffff", "0xffffffffffffffff"}, {cat, "beta,10000000000000000", "-1:0x2 ERANGE"},
		{cat, "zz", "-1:0x0"}, {cat, "alpha,zz,beta", "-1:0x1"},  // bits before a bad token stay
		{type, "CCNRA", "0x3"}, {type, "ALL", "0x7"}, {type, "ccnr,ehole", "0x5"}, {type, "12345", "0x2345"},
		{type, "ccnr,0x8", "0x8"}, {type, "10,ccnr", "0x11"},  // a number replaces names before it, names OR in
		{type, "ccnr,,ehole", "0x4"}, {type, "fffffffffffffffffffff", "0xffff"}, {type, nullptr, "0x0"},
		{type, "x", "-1:0x0"}, {type, "CCNR", "-1:0xcc"}, {type, "ccnr:x", "-1:0xcc"},  // names are case sensitive
		{ml, "5", "5:0:0x0:0x0"}, {ml, "::", "0:0:0x0:0x0"}, {ml, nullptr, "0:0:0x0:0x0"},
		{ml, "secret:High:alpha,beta:CCNRA", "5:1:0x3:0x3"}, {ml, "300:2:face:ccnr,ehole", "44:2:0x100:0x5"},
		{ml, "1:0:0:ccnr:x", "<null>"},  // further ':' belong to the type text
		{ml, "bogus", "<null>"}, {ml, "1:bogus", "<null>"}, {ml, "1:0:zz", "<null>"}, {ml, "1:0:0:zz", "<null>"},
		{rl, "1,2,3", "3,2,1:"}, {rl, "3,3,1", "3,1:"}, {rl, "5,", "5,0:"}, {rl, "No,4", "4,0:"}, {rl, "0,-1", "-1,0:"},
		{rl, nullptr, ":"}, {rl, "No:No", ":"}, {rl, "No", ":"}, {rl, "", ":"}, {rl, "2,1", "2,1:"}, {rl, ":3", ":3"}, {rl, "1:2:3", "1:2"},
		{rl, "1,3,2:5,5", "3,2,1:5"}, {rl, "Nein:Nein", ":", &kGerman}, {rl, "No:Nein", ":", &kGerman},
		{rl, "x:1", "<null>"}, {rl, "1:x", "<null>"},
		{whole, "", "0:0:0x0:0x0!:"}, {whole, nullptr, "0:0:0x0:0x0!:"}, {whole, "!", "0:0:0x0:0x0!:"},
		{whole, "2:High:0x0:0x0!No:No", "2:1:0x0:0x0!:"}, {whole, ":Low:0x0:CCNRA!", "0:0:0x0:0x3!:"},
		{whole, "secret:Low:alpha,wide:ehole!9,5:1", "5:0:0x31:0x4!9,5:1"}, {whole, "top", "255:0:0x0:0x0!:"},
		{whole, "1!2!3", "1:0:0x0:0x0!2:"}, {whole, "x!1", "<null>"}, {whole, "1:2:3!x", "<null>"},
	};
	for (const auto &r : rows) {
		SCOPED_TRACE(testing::Message() << '"' << (r.text ? r.text : "(null)") << '"' << (r.words ? " translated" : ""));
		set_translation(r.words);
		vyr_test::Injector none(0);  // fails nothing, but notes every block
		EXPECT_EQ(none.run([&] { return r.read(r.text); }), r.want);
		EXPECT_EQ(vyr_test::FailAlloc::live(), 0u) << "blocks left behind";
	}
	EXPECT_EQ(vyrl_ucnt(VYRL_ZERO), 1);  // empty texts gave fresh records
	std::vector<char> b = buffer("1:0:alpha,beta:ccnr!4,x");  // in place, only its own separators are cut
	EXPECT_EQ(vyrl_get_from_text_nc(b.data()), nullptr);
	EXPECT_EQ(std::string(b.begin(), b.end()), std::string("1\0" "0\0" "alpha,beta\0" "ccnr\0" "4\0" "x", 24));
	vyr_role_t role{9, 7, 3}, *list = &role;  // failed readers leave their out values alone
	uint32_t count = 7;
	EXPECT_TRUE(vyr_roles_from_text(b.data() + 22, &list, &count) == -1 && list == &role && count == 7);  // "x"
	EXPECT_TRUE(vyr_role_from_text(&role, "x") == -1 && role.attr == 7 && vyr_role_from_text(&role, "5") == 0 && role.id + role.attr + role.rights == 5);
}

// One open of each database per record, none for texts without names, every
// open closed, also on failure; without the databases numbers still read.
TEST_F(TextTest, DatabaseWork)
{
	EXPECT_EQ(whole("secret:High:alpha,,beta,0x8,face:ehole!2:1") + ilev("High") + type("ccnr") + whole(""),
	          "5:1:0x10b:0x4!2:110x10:0:0x0:0x0!:");  // records are read in two forms
	EXPECT_EQ(whole("1:0:zz"), "<null>");
	const textmem_stats s = textmem_get_stats();
	EXPECT_EQ((std::vector<long>{s.lev_opens, s.lev_closes, s.cat_opens, s.cat_closes}), (std::vector<long>{4, 4, 4, 4}));
	textmem_set_open_ok(false, false);
	EXPECT_EQ(lev("12") + " " + lev("secret") + " " + cat("face,0x10000") + " " + cat("alpha"), "12 -1 0x1face -1:0x0");
	EXPECT_EQ(whole("7:High:0x5:ccnr!3,9:No"), "7:1:0x5:0x1!9,3:");
}

// Reads t with `read` swept for allocation failure (each gives NULL, nothing leaks).
template <class Rec>
std::string read_swept(const char *t, Rec *(*read)(char *), char *(*write)(const Rec *, int))
{
	std::string text;
	vyr_test::sweep_alloc_failures([&](Injector &inj) {
		std::vector<char> b = buffer(t);
		std::unique_ptr<Rec, vyr_test::LabelPut> got(inj.run([&] { return read(b.data()); }));
		EXPECT_FALSE(inj.fired() && got) << "a failure absorbed must leave no record";
		text = inj.fired() ? text : got ? take(write(got.get(), N)) : "<null>";
	});
	return text;
}

// No name in these texts also spells a number, which a failed lookup would read.
TEST_F(TextTest, RecordReaders)
{
	const char *t = "secret:High:alpha,beta:ehole!5,3,5:1";
	EXPECT_EQ(read_swept(t, +[](char *s) { return vyrl_get_from_text(s); }, vyrl_get_text), "5:1:0x3:0x4!5,3:1");
	EXPECT_EQ(read_swept(t, vyrl_get_from_text_nc, vyrl_get_text), "5:1:0x3:0x4!5,3:1");
	EXPECT_EQ(read_swept("", vyrl_get_from_text_nc, vyrl_get_text), "0:0:0x0:0x0!:");
	EXPECT_EQ(read_swept("secret:High:alpha:ehole", vyrml_get_from_text_nc, vyrml_get_text), "5:1:0x1:0x4");
	EXPECT_EQ(read_swept("5,3,5:1", vyrrl_get_from_text_nc, vyrrl_get_text), "5,3:1");
}
#endif

} // namespace

// The test translation: a definition in the program comes before the C
// library's, so the library's lookups of its fixed words end here.
extern "C" char *dcgettext(const char *domain, const char *msgid, int category) noexcept
{
	const std::string_view id(msgid);
	const Words *w = domain && std::strcmp(domain, "vyr") == 0 && category == LC_MESSAGES ? g_words : nullptr;
	const char *word = !w ? nullptr : id == "Low" ? w->low : id == "High" ? w->high : id == "No" ? w->no : id == ":No" ? w->colon_no : nullptr;
	return const_cast<char *>(word ? word : msgid);
}
