// Entry records and their line formats: parsing, composing, stream reading
// and writing, release. No plug-in is involved.

#include <vyr/namedb.h>

#include "support/entries.hh"
#include "support/failalloc.h"

#include <gtest/gtest.h>

#include <array>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <string>

using vyr_test::failed_with;
using vyr_test::take;

namespace {

constexpr int kUnchanged = 4242; // errno sentinel: "left as the caller had it"
char kOldName[] = "untouched";

using Fields = std::array<uint64_t, 4>;
Fields fields(const macent_t &e) { return {e.lev1, e.cat1, e.lev2, e.cat2}; }
Fields fields(const levent_t &e) { return {e.value}; }
Fields fields(const catent_t &e) { return {e.value}; }

// ---- parsing ----

enum Kind { Lev, Cat, Mac };

struct ParseCase {
	Kind kind;
	const char *line;
	const char *name; // nullptr: the parse fails
	Fields f;         // numeric fields afterwards; after a failure, those read so far
	int err;          // errno after a failure
};

const ParseCase kParseCases[] = {
	{Lev, "secret:3", "secret", {3}, 0},
	{Lev, "top:255", "top", {255}, 0},
	{Lev, "top:256", nullptr, {}, kUnchanged}, // a level above 255 fails without errno
	{Lev, ":7", "", {7}, 0},
	{Lev, "low 5", "low", {5}, 0},             // a blank separates like a colon...
	{Lev, "low :5", nullptr, {}, kUnchanged},  // ...so the colon stands where the number begins
	{Lev, " 5", "", {5}, 0},                   // leading blanks are not skipped: empty name
	{Lev, "x:5 # note\r", "x", {5}, 0},        // what follows the last number is ignored
	{Lev, "x:  +7", "x", {7}, 0},              // the number reader's blanks and sign
	{Lev, "x:-1", nullptr, {}, kUnchanged},    // a negative level wraps above 255
	{Lev, "x:99999999999999999999999", nullptr, {}, ERANGE},
	{Lev, "x:", nullptr, {}, kUnchanged},      // no digits
	{Lev, "nosep", nullptr, {}, EINVAL},
	{Cat, "c:0x10", "c", {0x10}, 0},
	{Cat, "c:ffffffffffffffff", "c", {~0ull}, 0}, // all ones is a value, not an overflow
	{Cat, "c:-1", "c", {~0ull}, 0},
	{Cat, "c:10000000000000000", nullptr, {}, ERANGE},
	{Mac, "u:1:f:2:ff", "u", {1, 0xf, 2, 0xff}, 0},
	{Mac, "u 1:f :2\t:ff", "u", {1, 0xf, 2, 0xff}, 0}, // blanks before the 2nd to 4th colon
	{Mac, "u :1:f:2:ff", nullptr, {}, kUnchanged},     // but not before the first
	{Mac, "u:1;f:2:ff", nullptr, {1}, EINVAL},
	{Mac, "u:1:f:256:ff", nullptr, {1, 0xf}, kUnchanged},
	{Mac, "u:1:f:2", nullptr, {1, 0xf, 2}, EINVAL},
	{Mac, "u:1:f:2:", nullptr, {1, 0xf, 2}, kUnchanged},
};

template <class E>
void check_parse(const ParseCase &c, E *(*parse)(const char *, E *))
{
	std::string line = c.line; // a copy that the parser must leave alone
	E e{};
	e.name = kOldName;
	errno = kUnchanged;
	E *r = parse(line.c_str(), &e);
	EXPECT_EQ(line, c.line);
	EXPECT_EQ(fields(e), c.f);
	if (!c.name) {
		EXPECT_EQ(r, nullptr);
		EXPECT_EQ(errno, c.err);
		EXPECT_EQ(e.name, kOldName) << "a failed parse must not touch the name";
		return;
	}
	ASSERT_EQ(r, &e);
	EXPECT_STREQ(e.name, c.name);
	std::free(e.name);
}

TEST(Parse, Table)
{
	for (const ParseCase &c : kParseCases) {
		SCOPED_TRACE(c.line);
		switch (c.kind) {
		case Lev: check_parse(c, parse_lev); break;
		case Cat: check_parse(c, parse_cat); break;
		case Mac: check_parse(c, parse_mac); break;
		}
	}
}

TEST(Parse, StaleRangeErrorIsNoOverflow)
{
	catent_t e{};
	errno = ERANGE; // left over from an earlier call
	ASSERT_EQ(parse_cat("c:ffffffffffffffff", &e), &e);
	std::free(e.name);
}

// Every function that takes a record, line or stream refuses NULL with
// EINVAL; the release functions take NULL and a NULL name quietly.
TEST(NullArguments, AreRefusedWithEinval)
{
	char n[] = "x";
	levent_t lev{n, 1};
	const catent_t noname{nullptr, 1};
	FILE *fp = std::tmpfile();
	ASSERT_NE(fp, nullptr);
	EXPECT_TRUE(failed_with(parse_lev(nullptr, &lev) == nullptr, EINVAL));
	EXPECT_TRUE(failed_with(parse_mac("u:1:2:3:4", nullptr) == nullptr, EINVAL));
	EXPECT_TRUE(failed_with(compose_mac(nullptr) == nullptr, EINVAL));
	EXPECT_TRUE(failed_with(compose_cat(&noname) == nullptr, EINVAL));
	EXPECT_TRUE(failed_with(fgetmacent_r(nullptr) == nullptr, EINVAL));
	EXPECT_TRUE(failed_with(fputlevent_r(nullptr, &lev) == -1, EINVAL));
	EXPECT_TRUE(failed_with(fputlevent_r(fp, nullptr) == -1, EINVAL));
	EXPECT_TRUE(failed_with(fputcatent_r(fp, &noname) == -1, EINVAL));
	EXPECT_EQ(std::ftell(fp), 0) << "nothing was written";
	std::fclose(fp);
	freemacent_r(nullptr);
	freelevent_r(nullptr);
	freecatent_r(static_cast<catent_t *>(std::calloc(1, sizeof(catent_t))));
}

// ---- composing ----

// A composed line as a string; the buffer is released.
std::string own(char *text)
{
	std::string out = text ? text : "null";
	std::free(text);
	return out;
}

TEST(Compose, Formats)
{
	char n[] = "secret", c[] = "cat", u[] = "user", empty[] = "";
	std::string long_name(5000, 'n'); // several rounds of the grow loop
	const levent_t lev{n, 200}, nameless{empty, 0}, long_lev{long_name.data(), 9};
	const catent_t cat{c, 0x8000000000000001ull};
	const macent_t mac{u, 255, ~0ull, 128, 0xabc};
	EXPECT_EQ(own(compose_lev(&lev)), "secret:200");
	EXPECT_EQ(own(compose_lev(&nameless)), ":0");
	EXPECT_EQ(own(compose_lev(&long_lev)), long_name + ":9");
	EXPECT_EQ(own(compose_cat(&cat)), "cat:8000000000000001");
	EXPECT_EQ(own(compose_mac(&mac)), "user:255:ffffffffffffffff:128:abc");
}

// ---- streams ----

// A temporary stream holding `text`, positioned at its start.
FILE *stream_of(const std::string &text)
{
	FILE *fp = std::tmpfile();
	if (!fp || std::fputs(text.c_str(), fp) < 0)
		std::abort();
	std::rewind(fp);
	return fp;
}

TEST(StreamRead, SkipsCommentsAndBlankLinesAndStopsOnBadLines)
{
	FILE *fp = stream_of("# header\n\n   \n  first:1\nbad line\n\t# indented\nsecond:2 # trailing #\nthird:3\n# end\n\n");
	EXPECT_EQ(take(fgetlevent_r(fp)), "first:1");
	errno = kUnchanged;
	EXPECT_EQ(fgetlevent_r(fp), nullptr); // "line" has no digits
	EXPECT_EQ(errno, kUnchanged);
	EXPECT_FALSE(std::feof(fp)) << "a bad line looks like the end; the EOF flag tells them apart";
	EXPECT_EQ(take(fgetlevent_r(fp)), "second:2");
	EXPECT_EQ(take(fgetlevent_r(fp)), "third:3");
	// Only comments and blank lines left: the end, errno untouched.
	EXPECT_EQ(fgetlevent_r(fp), nullptr);
	EXPECT_EQ(errno, kUnchanged);
	EXPECT_TRUE(std::feof(fp));
	std::fclose(fp);
}

TEST(StreamRead, LongLineComesInPiecesAndLastLineNeedsNoNewline)
{
	// 1030 letters: the first 1023 make a piece without separator, the
	// remaining 7 and ":5" make an entry of their own.
	FILE *fp = stream_of(std::string(1030, 'a') + ":5\nlast:6");
	errno = 0;
	EXPECT_EQ(fgetlevent_r(fp), nullptr);
	EXPECT_EQ(errno, EINVAL);
	EXPECT_EQ(take(fgetlevent_r(fp)), "aaaaaaa:5");
	EXPECT_EQ(take(fgetlevent_r(fp)), "last:6");
	std::fclose(fp);
}

// ---- allocation failure ----

// Reading covers the record, the parser's private copy and the name copy.
TEST(AllocFailure, StreamRead)
{
	FILE *fp = stream_of("# users\nroot:1:2:3:4\n");
	static char buf[4096];
	std::setvbuf(fp, buf, _IOFBF, sizeof buf); // no stdio allocation inside the sweep
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		std::rewind(fp);
		macent_t *m = inj.run([&] { return fgetmacent_r(fp); });
		if (inj.fired()) {
			EXPECT_EQ(m, nullptr);
			return;
		}
		EXPECT_EQ(take(m), "root:1:2:3:4");
	});
	std::fclose(fp);
}

// Writing covers the compose grow loop, which reallocates for a long name,
// and the result of the write: the line and its newline.
TEST(AllocFailure, StreamWrite)
{
	char out[400] = {};
	FILE *fp = fmemopen(out, sizeof out, "w");
	ASSERT_NE(fp, nullptr);
	std::setvbuf(fp, nullptr, _IONBF, 0);
	std::string name(300, 'x');
	const macent_t e{name.data(), 1, 2, 3, 4};
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		const int r = inj.run([&] { return fputmacent_r(fp, &e); });
		EXPECT_EQ(r, inj.fired() ? -1 : 309);
	});
	std::fclose(fp);
	EXPECT_EQ(out, name + ":1:2:3:4\n") << "one line, from the attempt that succeeded";
}

} // namespace
