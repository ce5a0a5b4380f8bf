// The files back-end loaded by libvyr by name from the configuration file:
// every entry is bound, and libvyr's default entries work on top.
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <fstream>

#include <gtest/gtest.h>

#include <vyr/namedb.h>

#include "support/entries.hh"
#include "support/scratch_dir.hh"

namespace {

using vyr_test::failed_with;
using vyr_test::take;

TEST(FilesThroughLibvyr, AllThreeDatabases) {
    vyr_test::ScratchDir dir;
    ASSERT_TRUE(dir.ok());
    std::ofstream(dir / "dbroute.conf") << "mac_backend = files\nlev_backend = files\ncat_backend = files\n"
                                           "mac_charset = UTF-8\nlev_charset = UTF-8\ncat_charset = UTF-8\n"
                                           "mac_default_entry = 1\nfiles_dir = " << dir.path() << "\n";
    ::setenv("VYR_DBROUTE_CONF", (dir / "dbroute.conf").c_str(), 1);

    void* lev = openlevdb_r();
    ASSERT_NE(lev, nullptr) << std::strerror(errno);
    const levent_t low{const_cast<char*>("low"), 1}, high{const_cast<char*>("high"), 200};
    ASSERT_EQ(putlevent_r(lev, &low) + putlevent_r(lev, &high), 0);
    EXPECT_EQ(take(getlevnam_r(lev, "high")), "high:200");
    EXPECT_EQ(closelevdb_r(lev), 0);
    EXPECT_EQ(levexstval(nullptr, 200) * 2 + levexstval(nullptr, 3), 1);

    void* cat = opencatdb_r();
    const catent_t a{const_cast<char*>("a"), 1}, top{const_cast<char*>("top"), UINT64_C(1) << 63};
    ASSERT_EQ(putcatent_r(cat, &a) + putcatent_r(cat, &top), 0);
    EXPECT_EQ(is_cats_valid(cat, 1 | (UINT64_C(1) << 63)), 0);
    EXPECT_EQ(rmcatnam_r(cat, "a"), 0);
    EXPECT_EQ(is_cats_valid(cat, 1), 1);
    EXPECT_EQ(closecatdb_r(cat), 0);

    void* mac = openmacdb_r();
    const macent_t alice{const_cast<char*>("alice"), 2, 0x4, 6, 0x8};
    ASSERT_EQ(putmacent_r(mac, &alice), 0);
    EXPECT_EQ(take(getmacnam_r(mac, "alice")), "alice:2:4:6:8");
    EXPECT_EQ(take(getmacnam_r(mac, "nobody-in-file")), "nobody-in-file:0:0:0:0") << "ENOENT: a default entry";
    EXPECT_EQ(closemacdb_r(mac), 0);
    EXPECT_TRUE(failed_with(getlchuid(0, nullptr) == -1, EOPNOTSUPP)) << "the files back-end has no lch hooks";
}

}  // namespace
