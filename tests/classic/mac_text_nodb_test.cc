// Text form of the classic value with no level or category back-end: names
// of levels can't be written, everything else falls back to numbers.

#include "classic_test_util.h"
#include "support/failalloc.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>

using namespace classic_test;

namespace {

class Env : public ::testing::Environment {
    void SetUp() override { use_db_config("nodb", "# no back-ends configured\n"); }
};
const auto *const g_env = ::testing::AddGlobalTestEnvironment(new Env);

TEST(MacTextNoDb, LevelNamesFailWithZeroLength) {
    Mac m = make(1, 2, 0);
    for (int flags : {1, 3, 1 | 2 | 8, 15}) {
        size_t len = 55;
        EXPECT_EQ(mac_to_text(m.get(), &len, flags), nullptr) << flags;
        EXPECT_EQ(len, 0u) << flags;
    }
}

TEST(MacTextNoDb, CategoriesAndTypesStillWrite) {
    struct Case {
        uint64_t cat;
        uint32_t type;
        int flags;
        const char *text;
    } cases[] = {
        {0x2a, 0, 1 | 4, "0x2a"},
        {0, 0, 1 | 4, "0x0"},
        {0x2a, 0x1003f, 1 | 4 | 8, "0x2a:equ"},
        {0x2a, 0x1003f, 4 | 8, "2a:1003f"},
        {0x2a, 0x1003f, 0, "1:2a:1003f"},
    };
    for (const auto &c : cases) {
        Mac m = make(1, c.cat, c.type);
        size_t len = 0;
        Text t{mac_to_text(m.get(), &len, c.flags)};
        ASSERT_NE(t, nullptr) << c.text;
        EXPECT_STREQ(t.get(), c.text);
        EXPECT_EQ(len, std::strlen(c.text));
    }
}

TEST(MacTextNoDb, ReaderFallsBackToNumbers) {
    struct Case {
        const char *text;
        int rc;
        unsigned lev;
        uint64_t cat;
    } cases[] = {
        {"4:a,b", 0, 4, 0xb},  // names read as hexadecimal numbers
        {"4:0x10", 0, 4, 0x10},
        {"one", -1, 8, 8},
        {"4:pair", -1, 8, 8},
    };
    for (const auto &c : cases) {
        Mac m = make(8, 8, 0);
        errno = 0;
        EXPECT_EQ(mac_from_text(m.get(), c.text), c.rc) << c.text;
        if (c.rc) {
            EXPECT_EQ(errno, EINVAL);
        }
        EXPECT_EQ(m->lev, c.lev) << c.text;
        EXPECT_EQ(m->cat, c.cat) << c.text;
    }
}

// With no database in the way, the failing allocation can be pinned: the
// first is the copy of the type name, the second the result buffer.  Either
// way the length measured so far is reported.
TEST(MacTextNoDb, LengthReportedWhenAllocationFails) {
    Mac m = make(1, 5, 0);
    Text warm{mac_to_text(m.get(), nullptr, 1 | 4 | 8)};  // the databases start once
    ASSERT_STREQ(warm.get(), "0x5:subject");

    struct Case {
        long fail_at;
        size_t len;
    } cases[] = {{1, 4}, {2, 11}};
    for (const Case &c : cases) {
        vyr_test::FailAlloc::reset();
        vyr_test::Injector inj(c.fail_at);
        size_t len = 0;
        char *t = inj.run([&] { return mac_to_text(m.get(), &len, 1 | 4 | 8); });
        EXPECT_TRUE(inj.fired());
        EXPECT_EQ(t, nullptr);
        EXPECT_EQ(len, c.len) << "allocation " << c.fail_at;
        EXPECT_EQ(vyr_test::FailAlloc::live(), 0u);
        std::free(t);
    }
}

}  // namespace
