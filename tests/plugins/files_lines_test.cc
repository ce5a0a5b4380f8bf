// The files back-end's line reader and writer.
#include <cstdint>
#include <ostream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "lines.hh"

namespace {

using vyr::files::Db;
using vyr::files::Entry;
using vyr::files::LineKind;

struct LineCase {
    Db db;
    std::string line;
    LineKind kind;
    std::string name;                    // when an entry
    std::array<std::uint64_t, 4> f{};    // when an entry
};

void PrintTo(const LineCase& c, std::ostream* os) { *os << '"' << c.line << '"'; }

LineCase no_entry(Db db, std::string line, LineKind kind) { return {db, std::move(line), kind, "", {}}; }

class FilesLine : public ::testing::TestWithParam<LineCase> {};

TEST_P(FilesLine, Parses) {
    const LineCase& c = GetParam();
    Entry e;
    // A std::string keeps the NUL that the number reader relies on.
    const std::string line = c.line;
    ASSERT_EQ(vyr::files::parse_line(c.db, line, e), c.kind) << '"' << c.line << '"';
    if (c.kind != LineKind::Entry) return;
    EXPECT_EQ(e.name, c.name);
    EXPECT_EQ(e.f, c.f);
}

constexpr std::uint64_t kMax = UINT64_MAX;

INSTANTIATE_TEST_SUITE_P(
    Levels, FilesLine,
    ::testing::Values(LineCase{Db::Lev, "low:0", LineKind::Entry, "low", {0}},
                      LineCase{Db::Lev, "top:255", LineKind::Entry, "top", {255}},
                      no_entry(Db::Lev, "over:256", LineKind::Malformed),
                      no_entry(Db::Lev, "neg:-1", LineKind::Malformed),
                      no_entry(Db::Lev, "huge:99999999999999999999999", LineKind::Malformed),
                      LineCase{Db::Lev, "blank 5", LineKind::Entry, "blank", {5}},
                      no_entry(Db::Lev, "blank :5", LineKind::Malformed),
                      LineCase{Db::Lev, ":3", LineKind::Entry, "", {3}},
                      LineCase{Db::Lev, "  lead:4", LineKind::Entry, "lead", {4}},
                      LineCase{Db::Lev, "tail:6 # note\r", LineKind::Entry, "tail", {6}},
                      LineCase{Db::Lev, "plus:+7", LineKind::Entry, "plus", {7}},
                      no_entry(Db::Lev, "nodigits:x", LineKind::Malformed),
                      no_entry(Db::Lev, "name", LineKind::Malformed),
                      no_entry(Db::Lev, "name:", LineKind::Malformed),
                      no_entry(Db::Lev, "", LineKind::Empty),
                      no_entry(Db::Lev, " \t ", LineKind::Empty),
                      no_entry(Db::Lev, "   # x:1", LineKind::Empty),
                      LineCase{Db::Lev, "a#b:1", LineKind::Entry, "a#b", {1}},
                      no_entry(Db::Lev, std::string("nul\0:1", 6), LineKind::Malformed)));

INSTANTIATE_TEST_SUITE_P(
    Categories, FilesLine,
    ::testing::Values(LineCase{Db::Cat, "c:ff", LineKind::Entry, "c", {0xff}},
                      LineCase{Db::Cat, "c:0xFF", LineKind::Entry, "c", {0xff}},
                      LineCase{Db::Cat, "c:ffffffffffffffff", LineKind::Entry, "c", {kMax}},
                      no_entry(Db::Cat, "c:10000000000000000", LineKind::Malformed),
                      LineCase{Db::Cat, "c:-1", LineKind::Entry, "c", {kMax}},
                      LineCase{Db::Cat, "c:0", LineKind::Entry, "c", {0}},
                      no_entry(Db::Cat, "c:zz", LineKind::Malformed)));

INSTANTIATE_TEST_SUITE_P(
    Users, FilesLine,
    ::testing::Values(LineCase{Db::Mac, "u:1:ff:2:10", LineKind::Entry, "u", {1, 0xff, 2, 0x10}},
                      LineCase{Db::Mac, "u:1 :ff\t:2 :10", LineKind::Entry, "u", {1, 0xff, 2, 0x10}},
                      LineCase{Db::Mac, "u 1:ff:2:10", LineKind::Entry, "u", {1, 0xff, 2, 0x10}},
                      no_entry(Db::Mac, "u :1:ff:2:10", LineKind::Malformed),
                      no_entry(Db::Mac, "u:1;ff:2:10", LineKind::Malformed),
                      no_entry(Db::Mac, "u:1:ff:2", LineKind::Malformed),
                      no_entry(Db::Mac, "u:1:ff:2:", LineKind::Malformed),
                      no_entry(Db::Mac, "u:256:0:0:0", LineKind::Malformed),
                      no_entry(Db::Mac, "u:0:0:256:0", LineKind::Malformed),
                      LineCase{Db::Mac, "u:255:ffffffffffffffff:255:0 rest", LineKind::Entry, "u",
                               {255, kMax, 255, 0}}));

// A number must not be read from the next line of a file buffer.
TEST(FilesLines, NumbersStopAtTheEndOfTheirLine) {
    const std::string text = "a:\n5\nb:1:2:3:\n4\nc:7";
    std::vector<LineKind> lev_kinds;
    vyr::files::for_each_line(Db::Lev, text, [&](std::size_t, std::string_view, LineKind k, const Entry&) {
        lev_kinds.push_back(k);
        return true;
    });
    // "b:1:2:3:" is a level line with text after its one number.
    EXPECT_EQ(lev_kinds, (std::vector<LineKind>{LineKind::Malformed, LineKind::Malformed, LineKind::Entry,
                                                LineKind::Malformed, LineKind::Entry}));
    std::vector<LineKind> mac_kinds;
    vyr::files::for_each_line(Db::Mac, text, [&](std::size_t, std::string_view, LineKind k, const Entry&) {
        mac_kinds.push_back(k);
        return true;
    });
    EXPECT_EQ(mac_kinds.at(2), LineKind::Malformed);
}

struct ComposeCase {
    Db db;
    Entry e;
    std::string line;
    bool storable;
};

void PrintTo(const ComposeCase& c, std::ostream* os) { *os << c.line; }

class FilesCompose : public ::testing::TestWithParam<ComposeCase> {};

TEST_P(FilesCompose, WritesAndChecks) {
    const ComposeCase& c = GetParam();
    std::string out;
    vyr::files::compose_line(c.db, c.e, out);
    EXPECT_EQ(out, c.line);
    EXPECT_EQ(vyr::files::storable(c.db, c.e), c.storable) << c.line;
}

INSTANTIATE_TEST_SUITE_P(
    Table, FilesCompose,
    ::testing::Values(ComposeCase{Db::Mac, {"u", {1, 0xff, 2, 0x10}}, "u:1:ff:2:10", true},
                      ComposeCase{Db::Mac, {"max", {255, kMax, 255, kMax}},
                                  "max:255:ffffffffffffffff:255:ffffffffffffffff", true},
                      ComposeCase{Db::Lev, {"l", {0}}, "l:0", true},
                      ComposeCase{Db::Lev, {"l", {256}}, "l:256", false},
                      ComposeCase{Db::Cat, {"c", {UINT64_C(1) << 63}}, "c:8000000000000000", true},
                      ComposeCase{Db::Cat, {"", {1}}, ":1", false},
                      ComposeCase{Db::Cat, {"a:b", {1}}, "a:b:1", false},
                      ComposeCase{Db::Cat, {"a b", {1}}, "a b:1", false},
                      ComposeCase{Db::Cat, {"#c", {1}}, "#c:1", false},
                      ComposeCase{Db::Cat, {"a#", {1}}, "a#:1", true}));

}  // namespace
