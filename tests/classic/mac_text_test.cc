// Text form of the classic value, against the fixed "classicdb" back-end:
// levels one(1) two(2) seven(7) 9lives(9) top(200); categories n(1) s(2)
// w(4) pair(0x30) sw(6) face(0x40), walked in that order.

#include "classic_test_util.h"
#include "classicdb.h"
#include "support/failalloc.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>
#include <cwchar>
#include <iterator>
#include <random>
#include <string>

using namespace classic_test;

namespace {

class Env : public ::testing::Environment {
    void SetUp() override {
        use_db_config("names",
                      "lev_backend = classicdb\nlev_charset = ANSI_X3.4-1968\n"
                      "cat_backend = classicdb\ncat_charset = ANSI_X3.4-1968\n");
    }
};
const auto *const g_env = ::testing::AddGlobalTestEnvironment(new Env);

struct ToTextCase {
    unsigned lev;
    uint64_t cat;
    uint32_t type;
    int flags;
    const char *text;
};

void check_to_text(const ToTextCase &c) {
    Mac m = make(c.lev, c.cat, c.type);
    size_t len = 12345;
    Text t{mac_to_text(m.get(), &len, c.flags)};
    ASSERT_NE(t, nullptr) << c.text;
    EXPECT_STREQ(t.get(), c.text) << "flags " << c.flags;
    EXPECT_EQ(len, std::strlen(c.text)) << c.text;
}

TEST(MacToText, NumericForms) {
    const ToTextCase cases[] = {
        // default fields: type only for an object with waivers
        {5, 0xab, 0x1002d, 0, "5:ab:1002d"},
        {5, 0xab, 0x10000, 0, "5:ab"},
        {5, 0xab, 0, 0, "5:ab"},
        {5, 0xab, 0x20000, 0, "5:ab"},
        {5, 0xab, 0x30001, 0, "5:ab"},  // class 0x30000 is no plain object
        {255, ~0ull, 0x1ff00, 0, "255:ffffffffffffffff"},
        // explicit selections
        {3, 0x10, 0, 2, "3"},
        {3, 0x10, 0, 4, "10"},
        {3, 0x10, 0, 8, "0"},
        {3, 0x10, 0, 6, "3:10"},
        {3, 0x10, 0, 10, "3:0"},
        {3, 0x10, 0, 12, "10:0"},
        {3, 0x10, 0x7fff0012, 14, "3:10:7fff0012"},
        {0, 0, 0, 14, "0:0:0"},
        {0, 0, 0x10000, 0x7ff0 | 8, "10000"},  // untested bits ignored
    };
    for (const ToTextCase &c : cases) check_to_text(c);
}

TEST(MacToText, NamedForms) {
    const ToTextCase cases[] = {
        {1, 0, 0, 1, "one:0x0"},                // no entry for mask 0
        {3, 7, 0, 1, "3:n,s,w"},                // unnamed level, walked mask
        {2, 6, 0, 1, "two:sw"},                 // an entry for the whole mask
        {7, 0x37, 0, 1, "seven:n,s,w,pair"},    // a multi-bit entry in the walk
        {200, 0x101, 0, 1, "top:n,0x100"},      // bits no entry covers
        {0, 0x100, 0, 1, "0:0x100"},
        {0, 0x46, 0, 1, "0:s,w,face"},          // sw no longer fits once s and w are taken
        {9, 1, 0, 1, "9lives:n"},
        {1, 2, 0x1002d, 1, "one:s:low"},        // default fields, type by name
        {1, 2, 0x10000, 1, "one:s"},
        {1, 2, 0, 9, "subject"},
        {1, 2, 0, 8, "0"},
        {1, 2, 0, 11, "one:subject"},
        {1, 2, 0, 15, "one:s:subject"},
        {1, 2, 0x10000, 9, "object"},
        {1, 2, 0x1003f, 9, "equ"},
        {1, 2, 0x10012, 9, "equ_w"},
        {1, 2, 0x10009, 9, "r--r--"},
        {1, 2, 0x3003f, 9, "rwxrwx"},           // not a named word: letters, class lost
        {1, 2, 0x100c0, 9, "------"},           // 0x40, 0x80 have no letter
        {1, 2, 0x3003f, 8, "3003f"},
        {1, 2, 0x10024, 13, "s:--x--x"},
    };
    for (const ToTextCase &c : cases) check_to_text(c);
}

TEST(MacToText, InvalidOrNullLeavesLenAlone) {
    Mac bad = make(1, 1, 0x12);
    for (const mac_t *m : {static_cast<const mac_t *>(nullptr), static_cast<const mac_t *>(bad.get())}) {
        size_t len = 777;
        errno = 0;
        EXPECT_EQ(mac_to_text(m, &len, 15), nullptr);
        EXPECT_EQ(errno, EINVAL);
        EXPECT_EQ(len, 777u);
    }
    Mac ok = make(1, 1, 0);
    Text t{mac_to_text(ok.get(), nullptr, 0)};
    EXPECT_STREQ(t.get(), "1:1");
}

TEST(MacToText, DatabaseUse) {
    Mac m = make(7, 0x37, 0x1002d);
    struct Case {
        int flags;
        int lev_opens, cat_opens;
    } cases[] = {
        {0, 0, 0}, {14, 0, 0},  // numbers touch no database
        {1, 1, 2},              // the level once, the categories in each pass
        {1 | 4 | 8, 0, 2},      // names without the level open no level database
        {1 | 2 | 8, 1, 0},
    };
    for (const Case &c : cases) {
        classicdb_stats_t before = classicdb_stats;
        Text t{mac_to_text(m.get(), nullptr, c.flags)};
        ASSERT_NE(t, nullptr);
        EXPECT_EQ(classicdb_stats.lev_opens - before.lev_opens, c.lev_opens) << c.flags;
        EXPECT_EQ(classicdb_stats.lev_closes - before.lev_closes, c.lev_opens) << c.flags;
        EXPECT_EQ(classicdb_stats.cat_opens - before.cat_opens, c.cat_opens) << c.flags;
        EXPECT_EQ(classicdb_stats.cat_closes - before.cat_closes, c.cat_opens) << c.flags;
    }
    // A mask with an entry of its own costs a lookup and no walk.
    Mac exact = make(0, 6, 0);
    classicdb_stats_t before = classicdb_stats;
    Text t{mac_to_text(exact.get(), nullptr, MAC_TEXT_NAMES | MAC_TEXT_CAT)};
    EXPECT_STREQ(t.get(), "sw");
    EXPECT_EQ(classicdb_stats.cat_walks - before.cat_walks, 0);
    EXPECT_EQ(classicdb_stats.cat_lookups - before.cat_lookups, 2);
}

// The category database is read once to measure and once to write; a change
// in between is cut to the measured room and never written past it.
TEST(MacToText, CategoryChangeBetweenPassesStaysInBuffer) {
    Mac m = make(1, 0x37, 0x10009);
    classicdb_stats.cat_opens = 0;  // the n-th open adds n "+" to each name
    classicdb_stats.grow_cat_names = 1;
    size_t len = 0;
    Text t{mac_to_text(m.get(), &len, MAC_TEXT_NAMES)};
    classicdb_stats.grow_cat_names = 0;
    ASSERT_NE(t, nullptr);
    // Measured with one "+" a name, written with two: the type is cut off.
    std::string measured = "one:n+,s+,w+,pair+:r--r--";
    EXPECT_EQ(len, measured.size());
    EXPECT_EQ(std::strlen(t.get()), len);
    EXPECT_EQ(std::string(t.get()), std::string("one:n++,s++,w++,pair++:r--r--").substr(0, len));
}

TEST(MacToText, WideText) {
    Mac m = make(2, 0x46, 0x10009);
    size_t len = 99;
    std::unique_ptr<wchar_t, FreeDeleter> w{mac_to_wtext(m.get(), &len, MAC_TEXT_NAMES)};
    ASSERT_NE(w, nullptr);
    EXPECT_EQ(std::wcscmp(w.get(), L"two:s,w,face:r--r--"), 0);
    EXPECT_EQ(len, 19u);

    Mac bad = make(0, 0, 0x1);
    len = 99;
    errno = 0;
    EXPECT_EQ(mac_to_wtext(bad.get(), &len, 0), nullptr);
    EXPECT_EQ(errno, EINVAL);
    EXPECT_EQ(len, 0u);
}

struct FromTextCase {
    const char *text;
    int rc;
    unsigned lev;
    uint64_t cat;
    uint32_t type;
};

// Starting value for the reader: level 99, mask 0x9999, an object type that
// no text below produces by accident.
constexpr unsigned kLev0 = 99;
constexpr uint64_t kCat0 = 0x9999;
constexpr uint32_t kType0 = 0x10024;

TEST(MacFromText, Table) {
    const FromTextCase cases[] = {
        {"7", 0, 7, 0, kType0},             // type left alone
        {"7::", 0, 7, 0, 0x10000},          // empty type field: empty letter form
        {"", 0, 0, 0, kType0},
        {" 7", 0, 7, 0, kType0},
        {"+7:", 0, 7, 0, kType0},
        {"255", 0, 255, 0, kType0},
        {"seven:n,w", 0, 7, 5, kType0},
        {"9lives", 0, 9, 0, kType0},        // a level name wins over the number
        {"1:face", 0, 1, 0x40, kType0},     // so does a category name
        {"1:,,1,,2,,", 0, 1, 3, kType0},
        {"1:0x100,n", 0, 1, 0x101, kType0},
        {"1:a,b", 0, 1, 0xb, kType0},       // no such names: numbers
        {"1:0:rwxrwx", 0, 1, 0, 0x1003f},
        {"1:0:equ", 0, 1, 0, 0x1003f},
        {"1:0:low", 0, 1, 0, 0x1002d},
        {"1:0:equ_w", 0, 1, 0, 0x10012},
        {"1:0:object", 0, 1, 0, 0x10000},
        {"1:0:subject", 0, 1, 0, 0},
        {"1:0:0", 0, 1, 0, 0x10000},        // a number always makes an object
        {"1:0:1002d", 0, 1, 0, 0x1002d},
        {"1:0:2002d", 0, 1, 0, 0x3002d},
        {"1:0:ff", 0, 1, 0, 0x100ff},
        {"1:0:-1", 0, 1, 0, 0xffffffff},
        {"1:0:-------", 0, 1, 0, 0x10000},  // dashes may run past six
        {"1:0:r", 0, 1, 0, 0x10008},
        {"1:0:-w", 0, 1, 0, 0x10010},
        {"1:0:---r-x", 0, 1, 0, 0x10005},
        // failures: nothing changes
        {"256", -1, kLev0, kCat0, kType0},
        {"-1", -1, kLev0, kCat0, kType0},
        {"7abc", -1, kLev0, kCat0, kType0},
        {"99999999999999999999999", -1, kLev0, kCat0, kType0},
        {"eight", -1, kLev0, kCat0, kType0},
        {"1:zz", -1, kLev0, kCat0, kType0},
        {"1:n,zz", -1, kLev0, kCat0, kType0},
        {"1:0:rwxrwxr", -1, kLev0, kCat0, kType0},
        {"1:0:x", -1, kLev0, kCat0, kType0},
        {"1:0:1:2", -1, kLev0, kCat0, kType0},  // further ":" belong to the type
        {"1:0:Equ", -1, kLev0, kCat0, kType0},
        {"1:0: ", -1, kLev0, kCat0, kType0},
    };
    for (const FromTextCase &c : cases) {
        Mac m = make(kLev0, kCat0, kType0);
        errno = 0;
        EXPECT_EQ(mac_from_text(m.get(), c.text), c.rc) << '"' << c.text << '"';
        if (c.rc) {
            EXPECT_EQ(errno, EINVAL) << c.text;
        }
        EXPECT_EQ(m->lev, c.lev) << c.text;
        EXPECT_EQ(m->cat, c.cat) << c.text;
        EXPECT_EQ(m->type, c.type) << c.text;
        EXPECT_EQ(m->type_low, c.type & 0xffu) << c.text;
    }
}

TEST(MacFromText, NullArguments) {
    Mac m = make(kLev0, kCat0, kType0);
    EXPECT_EQ(mac_from_text(m.get(), nullptr), 0);
    EXPECT_EQ(m->lev, kLev0);
    EXPECT_EQ(m->cat, kCat0);
    EXPECT_EQ(m->type, kType0);
    EXPECT_EQ(mac_from_text(nullptr, nullptr), 0);
    errno = 4321;
    EXPECT_EQ(mac_from_text(nullptr, "1:2"), -1);
    EXPECT_EQ(errno, 4321);
}

// What a written text reads back as, by the fields that wrote it.
struct Expect {
    bool comparable;
    unsigned lev;
    uint64_t cat;
    uint32_t type;
};

Expect read_back(const mac_t &m, int flags, uint32_t start_type) {
    bool names = flags & MAC_TEXT_NAMES;
    bool lev = flags & MAC_TEXT_LEV, cat = flags & MAC_TEXT_CAT, type = flags & MAC_TEXT_TYPE;
    if (!(lev || cat || type)) {
        lev = cat = true;
        type = (m.type & 0xf0000) == 0x10000 && (m.type & 0xff) != 0;
    }
    if (!lev || (type && !cat)) return {false, 0, 0, 0};  // fields land by position
    if (!type) return {true, m.lev, cat ? m.cat : 0, start_type};
    uint32_t t = names ? (m.type == 0 ? 0 : (m.type & 0x3f) | 0x10000) : m.type | 0x10000;
    return {true, m.lev, m.cat, t};
}

TEST(MacTextRoundTrip, RandomValuesEveryFlagCombination) {
    std::mt19937_64 rng(20240611);
    const uint32_t kTypes[] = {0, 0x10000, 0x1002d, 0x1003f, 0x10012, 0x20000, 0x100, 0x7f000000};
    int compared = 0;
    for (int round = 0; round < 300; ++round) {
        uint32_t type = kTypes[rng() % std::size(kTypes)];
        if (round % 3 == 0) type = 0x10000 | static_cast<uint32_t>(rng() & 0xff);
        if (round % 7 == 0) type = static_cast<uint32_t>(rng()) | 0x10000;
        uint64_t cat = rng();
        if (round % 2) cat &= 0x7f;  // masks the database names
        Mac m = make(static_cast<unsigned>(rng() & 0xff), cat, type);
        ASSERT_EQ(mac_valid(m.get()), 0);
        for (int flags = 0; flags < 16; ++flags) {
            Text t{mac_to_text(m.get(), nullptr, flags)};
            ASSERT_NE(t, nullptr);
            Expect e = read_back(*m, flags, kType0);
            if (!e.comparable) continue;
            Mac back = make(kLev0, kCat0, kType0);
            ASSERT_EQ(mac_from_text(back.get(), t.get()), 0) << t.get();
            EXPECT_EQ(back->lev, e.lev) << t.get();
            EXPECT_EQ(back->cat, e.cat) << t.get();
            EXPECT_EQ(back->type, e.type) << t.get() << " from type " << std::hex << type << " flags " << flags;
            ++compared;
        }
    }
    EXPECT_EQ(compared, 300 * 8);  // eight comparable selections per value
}

TEST(MacTextAlloc, ToTextReleasesEverything) {
    start_databases();
    Mac m = make(7, 0x37, 0x10024);
    const std::string full = "seven:n,s,w,pair:--x--x";
    vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
        size_t len = 0;
        char *t = inj.run([&] { return mac_to_text(m.get(), &len, 15); });
        if (!inj.fired()) {
            ASSERT_NE(t, nullptr);
            EXPECT_EQ(full, t);
            EXPECT_EQ(len, full.size());
        } else if (t) {
            // A failed lookup falls back to numbers; what was written never
            // exceeds what was measured.
            EXPECT_LE(std::strlen(t), len);
        }
        std::free(t);
    });
}

TEST(MacTextAlloc, FromTextChangesNothingOnFailure) {
    start_databases();
    vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
        Mac m = make(kLev0, kCat0, kType0);
        int rc = inj.run([&] { return mac_from_text(m.get(), "seven:n,pair:equ"); });
        if (rc == 0) {
            EXPECT_EQ(m->lev, 7);
            EXPECT_EQ(m->cat, 0x31u);
            EXPECT_EQ(m->type, 0x1003fu);
        } else {
            EXPECT_TRUE(inj.fired());
            EXPECT_EQ(m->lev, kLev0);
            EXPECT_EQ(m->cat, kCat0);
            EXPECT_EQ(m->type, kType0);
        }
    });
}

TEST(MacTextAlloc, WideTextReleasesEverything) {
    start_databases();
    Mac m = make(1, 2, 0);
    vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
        size_t len = 5;
        wchar_t *w = inj.run([&] { return mac_to_wtext(m.get(), &len, 0); });
        if (!inj.fired()) {
            ASSERT_NE(w, nullptr);
            EXPECT_EQ(std::wcscmp(w, L"1:2"), 0);
            EXPECT_EQ(len, 3u);
        } else {
            EXPECT_EQ(w, nullptr);
            EXPECT_EQ(len, 0u);
        }
        std::free(w);
    });
}

}  // namespace
