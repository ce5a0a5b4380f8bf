// Text forms of the classic value and the kernel records, against the in-memory
// back-end "textmem" (names in SetUp, categories walked in that order), and with the databases off.

#include "classic_test_util.h"
#include "support/failalloc.h"
#include "support/memdb/textmem.h"
#include "support/scratch_dir.hh"

#include <vyr/namedb.h>

#include <cerrno>
#include <cstring>
#include <cwchar>
#include <fstream>
#include <langinfo.h>
#include <random>
#include <string>
#include <vector>

using namespace classic_test;
using WText = std::unique_ptr<wchar_t, Free>;

namespace {

// Points the databases at "textmem" in the locale's charset and starts them
// once: their start-up keeps memory for good, which must not happen inside a sweep.
bool start_databases() {
    static const vyr_test::ScratchDir dir;
    static const bool started = [] {
        const char *cs = nl_langinfo(CODESET);
        std::ofstream(dir / "dbroute.conf") << "lev_backend = textmem\nlev_charset = " << cs
                                            << "\ncat_backend = textmem\ncat_charset = " << cs << "\n";
        ::setenv("VYR_DBROUTE_CONF", (dir / "dbroute.conf").c_str(), 1);
        void *lev = openlevdb_r(), *cat = opencatdb_r();
        return lev && cat && closelevdb_r(lev) == 0 && closecatdb_r(cat) == 0;
    }();
    return started;
}

// "9lives" reads as a level name before it could fail as a number; "face" is a
// category name that wins over the number 0xface; "none" names mask 0, which no walk may take.
class MacText : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_TRUE(start_databases());
        textmem_reset();
        for (auto [name, v] : {std::pair{"one", 1}, {"two", 2}, {"seven", 7}, {"9lives", 9}, {"top", 200}})
            textmem_add_level(name, static_cast<uint8_t>(v));
        for (auto [name, v] : {std::pair{"none", 0}, {"n", 1}, {"s", 2}, {"w", 4}, {"pair", 0x30}, {"sw", 6}, {"face", 0x40}})
            textmem_add_category(name, static_cast<uint64_t>(v));
    }
};

void check_to_text(unsigned lev, uint64_t cat, uint32_t type, int flags, const char *text) {
    size_t len = 12345;
    Text t{mac_to_text(make(lev, cat, type).get(), &len, flags)};
    EXPECT_STREQ(t.get(), text) << "flags " << flags;
    EXPECT_EQ(len, std::strlen(text)) << text;
}

TEST_F(MacText, ToText) {
    const struct { unsigned lev; uint64_t cat; uint32_t type; int flags; const char *text; } cases[] = {
        // default fields: the type only for an object (class 0x10000) with waivers
        {5, 0xab, 0x1002d, 0, "5:ab:1002d"}, {5, 0xab, 0x10000, 0, "5:ab"}, {5, 0xab, 0x30001, 0, "5:ab"},
        {255, ~0ull, 0x1ff00, 0, "255:ffffffffffffffff"},
        // chosen fields, separators only between them; untested flag bits are ignored
        {3, 0x10, 0, 2, "3"}, {3, 0x10, 0, 8, "0"}, {3, 0x10, 0, 10, "3:0"}, {3, 0x10, 0, 12, "10:0"},
        {3, 0x10, 0x7fff0012, 14, "3:10:7fff0012"}, {0, 0, 0x10000, 0x7ff0 | 8, "10000"},
        // names: an entry for mask 0 too; unnamed level; an entry for the whole mask comes first;
        // a two-bit entry in the walk; bits no entry covers come last
        {0, 0, 0, 1, "0:none"}, {3, 7, 0, 1, "3:n,s,w"}, {2, 6, 0, 1, "two:sw"}, {7, 0x37, 0, 1, "seven:n,s,w,pair"},
        {200, 0x101, 0, 1, "top:n,0x100"},
        {0, 0x110, 0, 1, "0:0x110"},    // pair overlaps the mask but doesn't fit in it
        {0, 0x46, 0, 1, "0:s,w,face"},  // sw no longer fits once s and w are taken
        {1, 2, 0x1002d, 1, "one:s:low"}, {1, 2, 0, 9, "subject"}, {1, 2, 0, 11, "one:subject"},
        {1, 2, 0x10000, 9, "object"}, {1, 2, 0x10012, 9, "equ_w"}, {1, 2, 0x10009, 9, "r--r--"},
        {1, 2, 0x3003f, 9, "rwxrwx"},  // not a named word: letters, class lost
        {1, 2, 0x100c0, 9, "------"},  // 0x40 and 0x80 have no letter
        {1, 2, 0x10024, 13, "s:--x--x"},
    };
    for (const auto &c : cases) check_to_text(c.lev, c.cat, c.type, c.flags, c.text);
}

// Numbers touch no database; names open the level database once and the
// category database in each of the two passes, and close what they open.  A
// mask with an entry of its own costs one lookup a pass and no walk.
TEST_F(MacText, DatabaseUse) {
    const struct { uint64_t cat; int flags; long lev_opens, cat_opens, cat_lookups, walks; } cases[] = {
        {0x37, 14, 0, 0, 0, 0}, {0x37, 1, 1, 2, 2, 2}, {0x37, 1 | 2 | 8, 1, 0, 0, 0}, {6, 1 | 4, 0, 2, 2, 0}};
    for (const auto &c : cases) {
        textmem_clear_stats();
        ASSERT_NE(Text{mac_to_text(make(7, c.cat, 0x1002d).get(), nullptr, c.flags)}, nullptr);
        const textmem_stats s = textmem_get_stats();
        EXPECT_EQ(std::vector<long>({s.lev_opens, s.lev_closes, s.cat_opens, s.cat_closes, s.cat_lookups, s.cat_sets}),
                  std::vector<long>({c.lev_opens, c.lev_opens, c.cat_opens, c.cat_opens, c.cat_lookups, c.walks}))
            << c.flags;
    }
}

// A category name that grows between the measuring and the writing pass is
// cut to the measured room, and the pieces after it are not written past it either.
TEST_F(MacText, CategoryChangeBetweenPassesStaysInBuffer) {
    textmem_clear_stats();
    textmem_set_cat_open_hook([](long opens) {
        if (opens != 2) return;
        textmem_reset();
        for (auto [name, v] : {std::pair{"north-by-northwest", 1}, {"s", 2}, {"w", 4}})
            textmem_add_category(name, static_cast<uint64_t>(v));
    });
    size_t len = 0;
    Text t{mac_to_text(make(1, 0xf, 0x10009).get(), &len, MAC_TEXT_NAMES)};
    ASSERT_NE(t, nullptr);
    EXPECT_EQ(len, std::strlen("one:n,s,w,0x8:r--r--"));
    EXPECT_EQ(std::string(t.get()), std::string("one:north-by-northwest,s,w,0x8:r--r--").substr(0, len));
}

// An invalid value has no text: mac_to_text leaves the length alone, the wide
// form sets it to 0.  A valid one's wide length counts characters.
TEST_F(MacText, InvalidValuesAndWideText) {
    Mac bad = make(1, 1, 0x12);
    size_t len = 777;
    for (const mac_t *m : {static_cast<const mac_t *>(nullptr), static_cast<const mac_t *>(bad.get())}) {
        errno = 0;
        EXPECT_EQ(mac_to_text(m, &len, 15), nullptr);
        EXPECT_TRUE(errno == EINVAL && len == 777u);
    }
    EXPECT_EQ(mac_to_wtext(bad.get(), &len, 0), nullptr);
    EXPECT_EQ(len, 0u);
    WText w{mac_to_wtext(make(2, 0x46, 0x10009).get(), &len, MAC_TEXT_NAMES)};
    ASSERT_NE(w, nullptr);
    EXPECT_EQ(std::wcscmp(w.get(), L"two:s,w,face:r--r--"), 0);
    EXPECT_EQ(len, 19u);
}

// Start value of the reader: a type that no text below makes.
constexpr unsigned kLev0 = 99;
constexpr uint64_t kCat0 = 0x9999;
constexpr uint32_t kType0 = 0x10024;

// A text and the value it leaves, as str() gives it; NULL for a failure (EINVAL, start value kept).
void check_from_text(const char *text, const char *want) {
    Mac m = make(kLev0, kCat0, kType0);
    errno = 0;
    EXPECT_EQ(mac_from_text(m.get(), text), want ? 0 : -1) << '"' << text << '"';
    if (!want) { EXPECT_EQ(errno, EINVAL) << text; }
    EXPECT_EQ(str(m.get()), want ? want : "99 9999 10024") << text;
}

TEST_F(MacText, FromText) {
    const struct { const char *text, *want; } cases[] = {
        {"7", "7 0 10024"},    // no type field: the type stays
        {"7::", "7 0 10000"},  // an empty type field is an empty letter form
        {"", "0 0 10024"}, {" 7", "7 0 10024"}, {"9lives", "9 0 10024"}, {"1:face", "1 40 10024"},  // names win
        {"1:,,0x100,,n,,", "1 101 10024"}, {"1:0:equ", "1 0 1003f"}, {"1:0:-1", "1 0 ffffffff"},
        {"1:0:-------", "1 0 10000"}, {"1:0:r", "1 0 10008"}, {"1:0:---r-x", "1 0 10005"},  // short letter forms
        {"256", nullptr}, {"7abc", nullptr}, {"1:n,zz", nullptr}, {"1:0:rwxrwxr", nullptr}, {"1:0:x", nullptr},
        {"1:0:1:2", nullptr},  // further ":" belong to the type
    };  // the written forms (numbers, names, letters, named words) are read back in RoundTripEveryFlagCombination
    for (const auto &c : cases) check_from_text(c.text, c.want);
    Mac m = make(kLev0, kCat0, kType0);
    EXPECT_EQ(mac_from_text(m.get(), nullptr) + mac_from_text(nullptr, nullptr), 0);
    EXPECT_EQ(m->lev, kLev0);
    errno = 4321;
    EXPECT_EQ(mac_from_text(nullptr, "1:2"), -1);
    EXPECT_EQ(errno, 4321);
}

// Without databases the writer refuses level names (length 0) and prints masks
// in hex; the reader takes numbers only, category names too if they read as hex.
TEST_F(MacText, WithoutDatabases) {
    textmem_set_open_ok(false, false);
    for (int flags : {1, 3, 15}) {
        size_t len = 55;
        EXPECT_EQ(mac_to_text(make(1, 2, 0).get(), &len, flags), nullptr) << flags;
        EXPECT_EQ(len, 0u) << flags;
    }
    check_to_text(1, 0x2a, 0x1003f, 1 | 4 | 8, "0x2a:equ");
    check_to_text(1, 0, 0, 1 | 4, "0x0");
    check_from_text("4:a,b", "4 b 10024");
    check_from_text("one", nullptr);
    check_from_text("4:pair", nullptr);
    // The failing allocation can be pinned here: the type name's copy, then the
    // result buffer.  Either way the length measured so far is reported.
    Mac m = make(1, 5, 0);
    for (auto [fail_at, want_len] : {std::pair{1L, size_t{4}}, {2L, size_t{11}}}) {  // "0x5:" and "0x5:subject"
        vyr_test::FailAlloc::reset();
        vyr_test::Injector inj(fail_at);
        size_t len = 0;
        EXPECT_EQ(inj.run([&] { return mac_to_text(m.get(), &len, 1 | 4 | 8); }), nullptr);
        EXPECT_TRUE(inj.fired());
        EXPECT_EQ(len, want_len) << "allocation " << fail_at;
        EXPECT_EQ(vyr_test::FailAlloc::live(), 0u);
    }
}

// What a written text reads back as, by the fields that wrote it (fields land by position).
bool read_back(const mac_t &m, int flags, mac_t &want) {
    bool lev = flags & MAC_TEXT_LEV, cat = flags & MAC_TEXT_CAT, type = flags & MAC_TEXT_TYPE;
    if (!(lev || cat || type)) lev = cat = true, type = (m.type & 0xf0000) == 0x10000 && (m.type & 0xff) != 0;
    if (!lev || (type && !cat)) return false;
    uint32_t t = kType0;
    if (type) t = flags & MAC_TEXT_NAMES ? (m.type == 0 ? 0 : (m.type & 0x3f) | 0x10000) : m.type | 0x10000;
    want = {t & 0xff, m.lev, cat ? m.cat : 0, t};
    return true;
}

TEST_F(MacText, RoundTripEveryFlagCombination) {
    std::mt19937_64 rng(20240611);
    const uint32_t kTypes[] = {0, 0x10000, 0x1002d, 0x1003f, 0x10012, 0x20000, 0x100, 0x7f000000};
    for (int round = 0; round < 300; ++round) {
        uint32_t type = kTypes[rng() % std::size(kTypes)];
        if (round % 3 == 0) type = 0x10000 | static_cast<uint32_t>(rng() & 0xff);
        if (round % 7 == 0) type = static_cast<uint32_t>(rng()) | 0x10000;
        const uint64_t cat = round % 2 ? rng() & 0x7f : rng();  // small masks have names
        Mac m = make(static_cast<unsigned>(rng() & 0xff), cat, type);
        for (int flags = 0; flags < 16; ++flags) {
            Text t{mac_to_text(m.get(), nullptr, flags)};
            ASSERT_NE(t, nullptr);
            mac_t want;
            if (!read_back(*m, flags, want)) continue;
            Mac back = make(kLev0, kCat0, kType0);
            ASSERT_EQ(mac_from_text(back.get(), t.get()), 0) << t.get();
            EXPECT_EQ(str(back.get()), str(&want)) << t.get() << " from " << str(m.get());
        }
    }
}

// The records' conversions and texts call no kernel and test no type.
TEST_F(MacText, Records) {
    auto fields = [](const tavrel_mac_label_t &r) { return std::vector<uint64_t>({r.type_low, r.mac.lev, r.mac.cat}); };
    tavrel_mac_label_t rec{63, {4, 0x44}};
    Mac equ{tavrel_mac_label_t_to_mac_t(&rec)};
    EXPECT_EQ(str(equ.get()), "4 44 1003f");
    rec.type_low = 0;
    EXPECT_EQ(str(Mac{tavrel_mac_label_t_to_mac_t(&rec)}.get()), "4 44 10000");
    tavrel_mac_t prec{6, 0xa0};
    EXPECT_EQ(str(Mac{tavrel_mac_t_to_mac_t(&prec, 0x12)}.get()), "6 a0 12");
    mac_t_to_tavrel_mac_label_t(equ.get(), &rec);
    EXPECT_EQ(fields(rec), std::vector<uint64_t>({0x3f, 4, 0x44}));
    mac_t_to_tavrel_mac_label_t(nullptr, &rec);
    EXPECT_EQ(fields(rec), std::vector<uint64_t>({0, 0, 0}));
    EXPECT_STREQ(Text{tavrel_mac_t_to_text(&prec, 0x1002d, 0)}.get(), "6:a0:1002d");
    EXPECT_EQ(Text{tavrel_mac_t_to_text(&prec, 0x12, 0)}, nullptr);  // not a valid value
    rec = {0x12, {6, 0xa0}};
    EXPECT_STREQ(Text{tavrel_mac_label_t_to_text(&rec, 0)}.get(), "6:a0:10012");
    EXPECT_EQ(tavrel_mac_t_from_text(&prec, nullptr) + prec.lev + prec.cat, 0u);  // nothing read: zeros
    EXPECT_EQ(tavrel_mac_label_t_from_text(&rec, "3:4:7f01002d"), 0);
    EXPECT_EQ(fields(rec), std::vector<uint64_t>({0x2d, 3, 4}));
    expect_fail([&] { return tavrel_mac_label_t_from_text(&rec, "300:1"); }, EINVAL);
    EXPECT_EQ(rec.mac.lev, 3);
}

// Every allocating text call, under each allocation failure in turn: NULL or
// -1, the target as it was, nothing leaked.
TEST_F(MacText, AllocationFailure) {
    Mac m = make(7, 0x37, 0x10024);
    const std::string full = "seven:n,s,w,pair:--x--x";
    vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
        size_t len = 0;
        Text t{inj.run([&] { return mac_to_text(m.get(), &len, 15); })};
        if (!inj.fired()) {
            EXPECT_TRUE(full == t.get() && len == full.size());
        } else if (t) {
            EXPECT_LE(std::strlen(t.get()), len);  // a failed lookup falls back to the number
        }
    });
    vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
        size_t len = 5;
        WText w{inj.run([&] { return mac_to_wtext(m.get(), &len, 0); })};
        EXPECT_EQ(w == nullptr, inj.fired());
        EXPECT_EQ(len, inj.fired() ? 0u : 10u);
    });
    vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
        Mac v = make(kLev0, kCat0, kType0);
        const int rc = inj.run([&] { return mac_from_text(v.get(), "seven:n,pair:equ"); });
        EXPECT_EQ(rc != 0, inj.fired());
        EXPECT_EQ(str(v.get()), rc ? "99 9999 10024" : "7 31 1003f");
    });
    vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {  // the records' private value
        tavrel_mac_label_t rec{1, {1, 1}};
        const int rc = inj.run([&] { return tavrel_mac_label_t_from_text(&rec, "seven:pair:equ"); });
        EXPECT_EQ(rc != 0, inj.fired());
        EXPECT_EQ(rec.type_low, rc ? 1u : 0x3fu);
    });
}

}  // namespace
