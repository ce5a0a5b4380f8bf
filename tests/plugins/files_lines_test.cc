// The files back-end's line reader and writer.
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include <gtest/gtest.h>

#include "lines.hh"

namespace {

using namespace std::string_literals;
using namespace vyr::files;

// A parsed line as "empty", "malformed" or "name:field..." in decimal.
std::string parsed(Db db, const std::string& line) {
    Entry e;
    const LineKind kind = parse_line(db, line, e);
    if (kind != LineKind::Entry) return kind == LineKind::Empty ? "empty" : "malformed";
    std::string out(e.name);
    for (std::size_t i = 0; i < (db == Db::Mac ? 4u : 1u); ++i) out += ":" + std::to_string(e.f[i]);
    return out;
}

TEST(FilesLines, Parse) {
    const struct {
        Db db;
        std::string line;  // a std::string keeps the NUL the number reader relies on
        const char* want;
    } cases[] = {
        {Db::Lev, "over:256", "malformed"},
        {Db::Lev, "neg:-1", "malformed"},  // wraps above 255
        {Db::Lev, "blank 5", "blank:5"},     // a blank separates like a colon...
        {Db::Lev, "blank :5", "malformed"},  // ...and the colon then stands where the number begins
        {Db::Lev, "  lead:4", "lead:4"},     // unlike libvyr's parse_lev, leading blanks are skipped
        {Db::Lev, "tail:6 # note\r", "tail:6"},
        {Db::Lev, "   # x:1", "empty"},
        {Db::Lev, "a#b:1", "a#b:1"},  // only a leading '#' makes a comment
        {Db::Lev, "nul\0:1"s, "malformed"},
        {Db::Cat, "c:0xFF", "c:255"},
        {Db::Cat, "c:ffffffffffffffff", "c:18446744073709551615"},
        {Db::Cat, "c:10000000000000000", "malformed"},
        {Db::Mac, "u:1 :ff\t:2 :10", "u:1:255:2:16"},  // blanks before the 2nd to 4th colon
        {Db::Mac, "u :1:ff:2:10", "malformed"},
        {Db::Mac, "u:1:ff:2", "malformed"},
        {Db::Mac, "u:0:0:256:0", "malformed"},
        {Db::Mac, "u:255:ffffffffffffffff:255:0 rest", "u:255:18446744073709551615:255:0"},
    };
    for (const auto& c : cases) EXPECT_EQ(parsed(c.db, c.line), c.want) << '"' << c.line << '"';
}

// A number must not be read from the next line of a file buffer.
TEST(FilesLines, NumbersStopAtTheEndOfTheirLine) {
    const std::string text = "a:\n5\nb:1:2:3:\n4\nc:7";
    auto kinds = [&text](Db db) {
        std::vector<LineKind> out;
        for_each_line(db, text, [&](std::size_t, std::string_view, LineKind k, const Entry&) {
            out.push_back(k);
            return true;
        });
        return out;
    };
    using enum LineKind;  // "b:1:2:3:" is a level line with text after its one number
    EXPECT_EQ(kinds(Db::Lev), (std::vector<LineKind>{Malformed, Malformed, Entry, Malformed, Entry}));
    EXPECT_EQ(kinds(Db::Mac).at(2), Malformed);
}

// The line written for an entry, and whether it reads back as that entry.
TEST(FilesLines, ComposeAndStorable) {
    const struct {
        Db db;
        Entry e;
        const char* line;
        bool storable;
    } cases[] = {
        {Db::Mac, {"max", {255, UINT64_MAX, 255, 0x10}}, "max:255:ffffffffffffffff:255:10", true},
        {Db::Lev, {"l", {256}}, "l:256", false},
        {Db::Cat, {"c", {UINT64_C(1) << 63}}, "c:8000000000000000", true},
        {Db::Cat, {"", {1}}, ":1", false},
        {Db::Cat, {"a:b", {1}}, "a:b:1", false},
        {Db::Cat, {"#c", {1}}, "#c:1", false},
        {Db::Cat, {"a#", {1}}, "a#:1", true},
    };
    for (const auto& c : cases) {
        std::string out;
        compose_line(c.db, c.e, out);
        EXPECT_EQ(out, c.line);
        EXPECT_EQ(storable(c.db, c.e), c.storable) << c.line;
    }
}

}  // namespace
