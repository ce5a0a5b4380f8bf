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
template <class E>
Fields fields(const E &e) { return {e.value}; }

enum Kind { Lev, Cat, Mac };

// After a failure `name` is null, `f` holds the fields read so far and
// errno is `err`.
const struct ParseCase {
	Kind kind;
	const char *line, *name;
	Fields f;
	int err;
} kParseCases[] = {
	{Lev, "top:255", "top", {255}, 0},
	{Lev, "top:256", nullptr, {}, kUnchanged}, // a level above 255 fails without errno
	{Lev, ":7", "", {7}, 0},
	{Lev, "low 5", "low", {5}, 0},             // a blank separates like a colon...
	{Lev, "low :5", nullptr, {}, kUnchanged},  // ...so the colon stands where the number begins
	{Lev, " 5", "", {5}, 0},                   // leading blanks are not skipped: empty name
	{Lev, "x:5 # note\r", "x", {5}, 0},        // what follows the last number is ignored
	{Lev, "x:-1", nullptr, {}, kUnchanged},    // a negative level wraps above 255
	{Lev, "x:99999999999999999999999", nullptr, {}, ERANGE},
	{Lev, "x:", nullptr, {}, kUnchanged},
	{Lev, "nosep", nullptr, {}, EINVAL},
	{Cat, "c:0x10", "c", {0x10}, 0},
	{Cat, "c:ffffffffffffffff", "c", {~0ull}, 0}, // all ones is a value, not an overflow
	{Cat, "c:10000000000000000", nullptr, {}, ERANGE},
	{Mac, "u:1:f:2:ff", "u", {1, 0xf, 2, 0xff}, 0},
	{Mac, "u 1:f :2\t:ff", "u", {1, 0xf, 2, 0xff}, 0}, // blanks before the 2nd to 4th colon
	{Mac, "u :1:f:2:ff", nullptr, {}, kUnchanged},     // but not before the first
	{Mac, "u:1;f:2:ff", nullptr, {1}, EINVAL},
	{Mac, "u:1:f:256:ff", nullptr, {1, 0xf}, kUnchanged},
	{Mac, "u:1:f:2", nullptr, {1, 0xf, 2}, EINVAL},
};

template <class E>
void check_parse(const ParseCase &c, E *(*parse)(const char *, E *)) {
	std::string line = c.line; // a copy that the parser must leave alone
	E e{};
	e.name = kOldName;
	errno = kUnchanged;
	E *r = parse(line.c_str(), &e);
	EXPECT_EQ(line, c.line);
	EXPECT_EQ(fields(e), c.f);
	EXPECT_EQ(r, c.name ? &e : nullptr);
	EXPECT_EQ(errno, c.name ? kUnchanged : c.err);
	EXPECT_STREQ(e.name, c.name ? c.name : kOldName) << "a failed parse must not touch the name";
	if (r)
		std::free(e.name);
}

TEST(Parse, Table) {
	for (const ParseCase &c : kParseCases) {
		SCOPED_TRACE(c.line);
		c.kind == Lev ? check_parse(c, parse_lev) : c.kind == Cat ? check_parse(c, parse_cat) : check_parse(c, parse_mac);
	}
	catent_t e{};
	errno = ERANGE; // left over from an earlier call: no overflow
	ASSERT_EQ(parse_cat("c:ffffffffffffffff", &e), &e);
	std::free(e.name);
}

std::string own(char *text) {
	std::string out = text ? text : "null";
	std::free(text);
	return out;
}

// Composing, and NULL records, names, lines and streams refused with EINVAL
// (the release functions take NULL and a NULL name quietly).
TEST(Compose, FormatsAndNullArguments) {
	char n[] = "secret", c[] = "cat", u[] = "user";
	std::string long_name(5000, 'n'); // several rounds of the grow loop
	const levent_t lev{n, 200}, long_lev{long_name.data(), 9};
	const catent_t cat{c, 0x8000000000000001ull}, noname{nullptr, 1};
	const macent_t mac{u, 255, ~0ull, 128, 0xabc};
	EXPECT_EQ(own(compose_lev(&lev)), "secret:200");
	EXPECT_EQ(own(compose_lev(&long_lev)), long_name + ":9");
	EXPECT_EQ(own(compose_cat(&cat)), "cat:8000000000000001");
	EXPECT_EQ(own(compose_mac(&mac)), "user:255:ffffffffffffffff:128:abc");
	EXPECT_TRUE(failed_with(compose_cat(&noname) == nullptr, EINVAL));
	EXPECT_TRUE(failed_with(parse_lev(nullptr, nullptr) == nullptr, EINVAL));
	EXPECT_TRUE(failed_with(fgetmacent_r(nullptr) == nullptr, EINVAL));
	EXPECT_TRUE(failed_with(fputlevent_r(nullptr, &lev) == -1, EINVAL));
	FILE *fp = std::tmpfile();
	EXPECT_TRUE(failed_with(fputcatent_r(fp, &noname) == -1, EINVAL));
	EXPECT_EQ(std::ftell(fp), 0) << "nothing was written";
	std::fclose(fp);
	freemacent_r(nullptr);
	freecatent_r(static_cast<catent_t *>(std::calloc(1, sizeof(catent_t))));
}

FILE *stream_of(const std::string &text) {
	FILE *fp = std::tmpfile();
	if (!fp || std::fputs(text.c_str(), fp) < 0)
		std::abort();
	std::rewind(fp);
	return fp;
}

// Comments and blank lines are skipped; a bad line stops a read without
// EOF or errno; a line over 1023 bytes comes in pieces.
TEST(StreamRead, SkipsCommentsStopsOnBadLinesAndCutsLongLines) {
	FILE *fp = stream_of("# header\n\n   \n  first:1\nbad line\n\t# indented\nsecond:2 # trailing #\n" +
			     std::string(1030, 'a') + ":5\nlast:6\n# end\n\n");
	EXPECT_EQ(take(fgetlevent_r(fp)), "first:1");
	errno = kUnchanged;
	EXPECT_EQ(fgetlevent_r(fp), nullptr);
	EXPECT_EQ(errno, kUnchanged);
	EXPECT_FALSE(std::feof(fp)) << "a bad line looks like the end; the EOF flag tells them apart";
	EXPECT_EQ(take(fgetlevent_r(fp)), "second:2");
	errno = 0;
	EXPECT_TRUE(failed_with(fgetlevent_r(fp) == nullptr, EINVAL)) << "1023 letters, no separator";
	EXPECT_EQ(take(fgetlevent_r(fp)), "aaaaaaa:5");
	EXPECT_EQ(take(fgetlevent_r(fp)), "last:6");
	errno = kUnchanged;
	EXPECT_EQ(fgetlevent_r(fp), nullptr);
	EXPECT_EQ(errno, kUnchanged);
	EXPECT_TRUE(std::feof(fp));
	std::fclose(fp);
}

// Reading: the record, the parser's private copy and the name copy.
TEST(AllocFailure, StreamRead) {
	FILE *fp = stream_of("# users\nroot:1:2:3:4"); // the last line needs no newline
	static char buf[4096];
	std::setvbuf(fp, buf, _IOFBF, sizeof buf); // no stdio allocation inside the sweep
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		std::rewind(fp);
		const std::string got = take(inj.run([&] { return fgetmacent_r(fp); }));
		EXPECT_EQ(got, inj.fired() ? "null" : "root:1:2:3:4");
	});
	std::fclose(fp);
}

// Writing: the compose grow loop (a long name) and the write of line and
// newline.
TEST(AllocFailure, StreamWrite) {
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
