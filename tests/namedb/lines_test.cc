// Entry records and their line formats: parsing, composing, stream reading
// and writing, release.

#include <vyr/namedb.h>

#include "support/failalloc.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

namespace {

constexpr int kUnchanged = 4242; // errno sentinel: "left as the caller had it"
char kOldName[] = "untouched";

// ---- parsing ----

struct LevCase {
	const char *line;
	bool ok;
	const char *name;
	unsigned value;
	int err; // errno after a failure
};

const LevCase kLevCases[] = {
	{"secret:3", true, "secret", 3, 0},
	{"top:255", true, "top", 255, 0},
	{"top:256", false, nullptr, 0, kUnchanged},
	{":7", true, "", 7, 0},
	{"low 5", true, "low", 5, 0},              // a blank separates like a colon
	{"low\t9", true, "low", 9, 0},
	{"low :5", false, nullptr, 0, kUnchanged}, // the colon stands where the number begins
	{" 5", true, "", 5, 0},                    // a leading blank ends an empty name
	{"x:5 # note", true, "x", 5, 0},           // what follows the number is ignored
	{"x:5\r", true, "x", 5, 0},
	{"x:  +7", true, "x", 7, 0},
	{"x:007", true, "x", 7, 0},
	{"x:-1", false, nullptr, 0, kUnchanged},   // negative wraps above 255
	{"x:99999999999999999999999", false, nullptr, 0, ERANGE},
	{"x:", false, nullptr, 0, kUnchanged},
	{"x:abc", false, nullptr, 0, kUnchanged},
	{"nosep", false, nullptr, 0, EINVAL},
	{"", false, nullptr, 0, EINVAL},
};

class ParseLev : public testing::TestWithParam<LevCase> {};

TEST_P(ParseLev, Line)
{
	const LevCase &c = GetParam();
	levent_t e{kOldName, 0};
	errno = kUnchanged;
	levent_t *r = parse_lev(c.line, &e);
	if (!c.ok) {
		EXPECT_EQ(r, nullptr);
		EXPECT_EQ(errno, c.err);
		EXPECT_EQ(e.name, kOldName) << "a failed parse must not touch the name";
		return;
	}
	ASSERT_EQ(r, &e);
	EXPECT_STREQ(e.name, c.name);
	EXPECT_EQ(e.value, c.value);
	std::free(e.name);
}

INSTANTIATE_TEST_SUITE_P(Table, ParseLev, testing::ValuesIn(kLevCases));

struct CatCase {
	const char *line;
	bool ok;
	uint64_t value;
	int err;
};

const CatCase kCatCases[] = {
	{"c:1", true, 1, 0},
	{"c:ff", true, 0xff, 0},
	{"c:FF", true, 0xff, 0},
	{"c:0x10", true, 0x10, 0},
	{"c:8000000000000000", true, 0x8000000000000000ull, 0},
	{"c:ffffffffffffffff", true, ~0ull, 0}, // all ones is a value, not an overflow
	{"c:-1", true, ~0ull, 0},
	{"c:0", true, 0, 0},
	{"c:10000000000000000", false, 0, ERANGE},
	{"c:zz", false, 0, kUnchanged},
	{"c", false, 0, EINVAL},
};

class ParseCat : public testing::TestWithParam<CatCase> {};

TEST_P(ParseCat, Line)
{
	const CatCase &c = GetParam();
	catent_t e{kOldName, 0};
	errno = kUnchanged;
	catent_t *r = parse_cat(c.line, &e);
	if (!c.ok) {
		EXPECT_EQ(r, nullptr);
		EXPECT_EQ(errno, c.err);
		EXPECT_EQ(e.name, kOldName);
		return;
	}
	ASSERT_EQ(r, &e);
	EXPECT_STREQ(e.name, "c");
	EXPECT_EQ(e.value, c.value);
	std::free(e.name);
}

INSTANTIATE_TEST_SUITE_P(Table, ParseCat, testing::ValuesIn(kCatCases));

TEST(ParseCatErrno, StaleRangeErrorDoesNotFailAllOnes)
{
	catent_t e{nullptr, 0};
	errno = ERANGE;
	ASSERT_EQ(parse_cat("c:ffffffffffffffff", &e), &e);
	EXPECT_EQ(e.value, ~0ull);
	std::free(e.name);
}

struct MacCase {
	const char *line;
	bool ok;
	unsigned lev1;
	uint64_t cat1;
	unsigned lev2;
	uint64_t cat2;
	int err;
};

const MacCase kMacCases[] = {
	{"u:1:f:2:ff", true, 1, 0xf, 2, 0xff, 0},
	{"u:1 :f :2 :ff", true, 1, 0xf, 2, 0xff, 0}, // blanks before the 2nd..4th colon
	{"u: 1: f: 2: ff", true, 1, 0xf, 2, 0xff, 0},
	{"u 1:f:2:ff", true, 1, 0xf, 2, 0xff, 0},
	{"u:255:0:0:ffffffffffffffff # x", true, 255, 0, 0, ~0ull, 0},
	{"u :1:f:2:ff", false, 0, 0, 0, 0, kUnchanged}, // no blank before the first colon
	{"u:1;f:2:ff", false, 1, 0, 0, 0, EINVAL},
	{"u:1:f:256:ff", false, 1, 0xf, 0, 0, kUnchanged}, // fields read so far stay
	{"u:1:f:2", false, 1, 0xf, 2, 0, EINVAL},
	{"u:1:f:2:", false, 1, 0xf, 2, 0, kUnchanged},
	{"u:1:f:2:zz", false, 1, 0xf, 2, 0, kUnchanged},
};

class ParseMac : public testing::TestWithParam<MacCase> {};

TEST_P(ParseMac, Line)
{
	const MacCase &c = GetParam();
	macent_t e{kOldName, 0, 0, 0, 0};
	errno = kUnchanged;
	macent_t *r = parse_mac(c.line, &e);
	EXPECT_EQ(e.lev1, c.lev1);
	EXPECT_EQ(e.cat1, c.cat1);
	EXPECT_EQ(e.lev2, c.lev2);
	EXPECT_EQ(e.cat2, c.cat2);
	if (!c.ok) {
		EXPECT_EQ(r, nullptr);
		EXPECT_EQ(errno, c.err);
		EXPECT_EQ(e.name, kOldName);
		return;
	}
	ASSERT_EQ(r, &e);
	EXPECT_STREQ(e.name, "u");
	std::free(e.name);
}

INSTANTIATE_TEST_SUITE_P(Table, ParseMac, testing::ValuesIn(kMacCases));

TEST(Parse, NullArgumentsAreInvalid)
{
	levent_t l{};
	macent_t m{};
	errno = 0;
	EXPECT_EQ(parse_lev(nullptr, &l), nullptr);
	EXPECT_EQ(errno, EINVAL);
	errno = 0;
	EXPECT_EQ(parse_cat("c:1", nullptr), nullptr);
	EXPECT_EQ(errno, EINVAL);
	errno = 0;
	EXPECT_EQ(parse_mac(nullptr, &m), nullptr);
	EXPECT_EQ(errno, EINVAL);
}

TEST(Parse, LineIsNotModified)
{
	const char text[] = "user:1:2:3:4";
	char line[sizeof text];
	std::memcpy(line, text, sizeof text);
	macent_t e{};
	ASSERT_NE(parse_mac(line, &e), nullptr);
	EXPECT_EQ(std::memcmp(line, text, sizeof text), 0);
	std::free(e.name);
}

// ---- composing ----

TEST(Compose, Formats)
{
	char n[] = "secret", c[] = "cat", u[] = "user", empty[] = "";
	const levent_t lev{n, 200};
	const catent_t cat{c, 0x8000000000000001ull};
	const macent_t mac{u, 1, 0xabc, 255, 0};
	const levent_t nameless{empty, 0};

	struct Row {
		char *text;
		const char *want;
	} rows[] = {
		{compose_lev(&lev), "secret:200"},
		{compose_cat(&cat), "cat:8000000000000001"},
		{compose_mac(&mac), "user:1:abc:255:0"},
		{compose_lev(&nameless), ":0"},
	};
	for (const Row &r : rows) {
		ASSERT_NE(r.text, nullptr);
		EXPECT_STREQ(r.text, r.want);
		std::free(r.text);
	}
}

TEST(Compose, RefusesMissingRecordOrName)
{
	const catent_t noname{nullptr, 1};
	errno = 0;
	EXPECT_EQ(compose_cat(&noname), nullptr);
	EXPECT_EQ(errno, EINVAL);
	errno = 0;
	EXPECT_EQ(compose_mac(nullptr), nullptr);
	EXPECT_EQ(errno, EINVAL);
}

TEST(Compose, LongNameFitsExactly)
{
	std::string name(5000, 'n');
	const levent_t e{name.data(), 9};
	char *text = compose_lev(&e);
	ASSERT_NE(text, nullptr);
	EXPECT_EQ(std::string(text), name + ":9");
	std::free(text);
}

TEST(Compose, RoundTripsThroughParse)
{
	char name[] = "operator";
	const macent_t cases[] = {
		{name, 0, 0, 0, 0},
		{name, 255, ~0ull, 128, 0x8000000000000000ull},
		{name, 17, 0x1234567890abcdefull, 3, 1},
	};
	for (const macent_t &in : cases) {
		char *text = compose_mac(&in);
		ASSERT_NE(text, nullptr);
		macent_t out{};
		ASSERT_EQ(parse_mac(text, &out), &out) << text;
		EXPECT_STREQ(out.name, in.name);
		EXPECT_EQ(out.lev1, in.lev1);
		EXPECT_EQ(out.cat1, in.cat1);
		EXPECT_EQ(out.lev2, in.lev2);
		EXPECT_EQ(out.cat2, in.cat2);
		std::free(out.name);
		std::free(text);
	}
}

TEST(Compose, NameWithSeparatorDoesNotReadBack)
{
	char name[] = "a b";
	const catent_t in{name, 1};
	char *text = compose_cat(&in);
	ASSERT_NE(text, nullptr);
	EXPECT_STREQ(text, "a b:1");
	catent_t out{};
	// The blank ends the name; "b:1" is then read as the number.
	ASSERT_EQ(parse_cat(text, &out), &out);
	EXPECT_STREQ(out.name, "a");
	EXPECT_EQ(out.value, 0xbu);
	std::free(out.name);
	std::free(text);
}

// ---- streams ----

// A temporary stream holding `text`, positioned at its start.
struct Stream {
	FILE *fp;
	explicit Stream(const std::string &text) : fp(std::tmpfile())
	{
		if (!fp)
			std::abort();
		std::fputs(text.c_str(), fp);
		std::rewind(fp);
	}
	~Stream() { std::fclose(fp); }
	std::string contents() const
	{
		std::fflush(fp);
		std::rewind(fp);
		std::string out;
		for (int c; (c = std::fgetc(fp)) != EOF;)
			out += static_cast<char>(c);
		return out;
	}
};

TEST(StreamRead, SkipsCommentsAndBlankLinesAndStopsOnBadLines)
{
	Stream s("# header\n\n   \n  first:1\nbad line\n\t# indented comment\nsecond:2 # trailing #\nthird:3");
	levent_t *e = fgetlevent_r(s.fp);
	ASSERT_NE(e, nullptr);
	EXPECT_STREQ(e->name, "first");
	EXPECT_EQ(e->value, 1);
	freelevent_r(e);

	errno = 0;
	EXPECT_EQ(fgetlevent_r(s.fp), nullptr); // "bad line": "line" has no digits
	EXPECT_EQ(errno, 0);
	EXPECT_FALSE(std::feof(s.fp)) << "a bad line looks like the end; the EOF flag tells them apart";

	for (auto [name, value] : {std::pair{"second", 2}, std::pair{"third", 3}}) {
		e = fgetlevent_r(s.fp);
		ASSERT_NE(e, nullptr);
		EXPECT_STREQ(e->name, name);
		EXPECT_EQ(e->value, value);
		freelevent_r(e);
	}
	EXPECT_EQ(fgetlevent_r(s.fp), nullptr);
	EXPECT_TRUE(std::feof(s.fp));
}

TEST(StreamRead, OnlyCommentsGiveNullWithErrnoUntouched)
{
	Stream s("# a\n\n  # b\n");
	errno = kUnchanged;
	EXPECT_EQ(fgetcatent_r(s.fp), nullptr);
	EXPECT_EQ(errno, kUnchanged);
}

TEST(StreamRead, LongLineComesInPieces)
{
	// 1030 letters: the first 1023 make a piece without separator, the
	// remaining 7 and ":5" make an entry of their own.
	Stream s(std::string(1030, 'a') + ":5\n");
	errno = 0;
	EXPECT_EQ(fgetlevent_r(s.fp), nullptr);
	EXPECT_EQ(errno, EINVAL);
	levent_t *e = fgetlevent_r(s.fp);
	ASSERT_NE(e, nullptr);
	EXPECT_STREQ(e->name, "aaaaaaa");
	EXPECT_EQ(e->value, 5);
	freelevent_r(e);
}

TEST(StreamRead, UserEntriesAndNullStream)
{
	Stream s("alice:3:ff:1:0\n");
	macent_t *m = fgetmacent_r(s.fp);
	ASSERT_NE(m, nullptr);
	EXPECT_STREQ(m->name, "alice");
	EXPECT_EQ(m->lev1, 3);
	EXPECT_EQ(m->cat1, 0xffu);
	EXPECT_EQ(m->lev2, 1);
	EXPECT_EQ(m->cat2, 0u);
	freemacent_r(m);

	errno = 0;
	EXPECT_EQ(fgetmacent_r(nullptr), nullptr);
	EXPECT_EQ(errno, EINVAL);
}

TEST(StreamWrite, WritesLineAndNewline)
{
	Stream s("");
	char n[] = "lev", c[] = "cat", u[] = "usr";
	const levent_t l{n, 4};
	const catent_t k{c, 0x10};
	const macent_t m{u, 1, 2, 3, 4};
	EXPECT_EQ(fputlevent_r(s.fp, &l), 6);
	EXPECT_EQ(fputcatent_r(s.fp, &k), 7);
	EXPECT_EQ(fputmacent_r(s.fp, &m), 12);
	EXPECT_EQ(s.contents(), "lev:4\ncat:10\nusr:1:2:3:4\n");
}

TEST(StreamWrite, RefusesNullArguments)
{
	Stream s("");
	const levent_t noname{nullptr, 1};
	char n[] = "x";
	const levent_t ok{n, 1};
	errno = 0;
	EXPECT_EQ(fputlevent_r(s.fp, nullptr), -1);
	EXPECT_EQ(errno, EINVAL);
	errno = 0;
	EXPECT_EQ(fputlevent_r(nullptr, &ok), -1);
	EXPECT_EQ(errno, EINVAL);
	errno = 0;
	EXPECT_EQ(fputlevent_r(s.fp, &noname), -1);
	EXPECT_EQ(errno, EINVAL);
	EXPECT_EQ(s.contents(), "");
}

TEST(Release, NullAndNamelessRecords)
{
	freemacent_r(nullptr);
	freelevent_r(nullptr);
	freecatent_r(nullptr);
	auto *e = static_cast<catent_t *>(std::calloc(1, sizeof(catent_t)));
	ASSERT_NE(e, nullptr);
	freecatent_r(e); // name NULL
}

// ---- allocation failure ----

TEST(AllocFailure, ParseReleasesItsCopy)
{
	vyr_test::sweep_alloc_failures([](vyr_test::Injector &inj) {
		macent_t e{kOldName, 0, 0, 0, 0};
		macent_t *r = inj.run([&] { return parse_mac("someone:1:2:3:4", &e); });
		if (inj.fired()) {
			EXPECT_EQ(r, nullptr);
			// Either the private copy failed (name untouched) or the
			// final copy of the name did (name NULL).
			EXPECT_TRUE(e.name == kOldName || e.name == nullptr);
			return;
		}
		ASSERT_EQ(r, &e);
		std::free(e.name);
	});
}

TEST(AllocFailure, ComposeReleasesItsBuffer)
{
	std::string name(300, 'x');
	const macent_t e{name.data(), 1, 2, 3, 4};
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		char *text = inj.run([&] { return compose_mac(&e); });
		if (inj.fired()) {
			EXPECT_EQ(text, nullptr);
			return;
		}
		ASSERT_NE(text, nullptr);
		EXPECT_EQ(std::string(text), name + ":1:2:3:4");
		std::free(text);
	});
}

TEST(AllocFailure, StreamReadAndWrite)
{
	Stream s("# users\nroot:0:0:0:0\n");
	static char buf[4096];
	std::setvbuf(s.fp, buf, _IOFBF, sizeof buf); // no stdio allocation inside the sweep
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		std::rewind(s.fp);
		macent_t *m = inj.run([&] { return fgetmacent_r(s.fp); });
		if (inj.fired()) {
			EXPECT_EQ(m, nullptr);
			return;
		}
		ASSERT_NE(m, nullptr);
		EXPECT_STREQ(m->name, "root");
		freemacent_r(m);
	});

	Stream out("");
	std::setvbuf(out.fp, nullptr, _IONBF, 0);
	char n[] = "lev";
	const levent_t l{n, 1};
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		const int r = inj.run([&] { return fputlevent_r(out.fp, &l); });
		if (inj.fired()) {
			EXPECT_EQ(r, -1);
		} else {
			EXPECT_EQ(r, 6);
		}
	});
}

} // namespace
