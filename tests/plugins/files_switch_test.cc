// The files back-end behind libvyr's database functions: loaded by name from
// the configuration file, with libvyr's own checks and default entries on
// top. Start-up state is per process, so every test here shares one
// configuration made before the first database call.
#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <memory>
#include <string>

#include <gtest/gtest.h>

#include <vyr/namedb.h>

#include "support/entries.hh"
#include "support/scratch_dir.hh"

namespace {

using vyr_test::failed_with;
using vyr_test::take;

class FilesThroughLibvyr : public ::testing::Test {
protected:
    static void SetUpTestSuite() {
        dir_ = std::make_unique<vyr_test::ScratchDir>();
        ASSERT_TRUE(dir_->ok());
        const std::string conf = *dir_ / "dbroute.conf";
        std::ofstream(conf) << "mac_backend = files\nlev_backend = files\ncat_backend = files\n"
                               "mac_charset = UTF-8\nlev_charset = UTF-8\ncat_charset = UTF-8\n"
                               "mac_default_entry = 1\nfiles_dir = "
                            << dir_->path() << "\n";
        ::setenv("VYR_DBROUTE_CONF", conf.c_str(), 1);
    }
    static void TearDownTestSuite() { dir_.reset(); }
    static std::unique_ptr<vyr_test::ScratchDir> dir_;
};
std::unique_ptr<vyr_test::ScratchDir> FilesThroughLibvyr::dir_;

TEST_F(FilesThroughLibvyr, Levels) {
    void* db = openlevdb_r();
    ASSERT_NE(db, nullptr) << std::strerror(errno);
    const levent_t low{const_cast<char*>("low"), 1}, high{const_cast<char*>("high"), 200};
    ASSERT_EQ(putlevent_r(db, &low), 0);
    ASSERT_EQ(putlevent_r(db, &high), 0);
    EXPECT_EQ(take(getlevnam_r(db, "high")), "high:200");
    EXPECT_EQ(take(getlevval_r(db, 256 + 1)), "low:1");
    ASSERT_EQ(setlevent_r(db), 0);
    EXPECT_EQ(take(getlevent_r(db)), "low:1");
    ASSERT_EQ(closelevdb_r(db), 0);
    EXPECT_EQ(levexstval(nullptr, 200), 0);
    EXPECT_EQ(levexstval(nullptr, 3), 1);
}

TEST_F(FilesThroughLibvyr, Categories) {
    void* db = opencatdb_r();
    ASSERT_NE(db, nullptr);
    const catent_t a{const_cast<char*>("a"), 1}, top{const_cast<char*>("top"), UINT64_C(1) << 63};
    const catent_t two_bits{const_cast<char*>("two"), 3};
    ASSERT_EQ(putcatent_r(db, &a), 0);
    ASSERT_EQ(putcatent_r(db, &top), 0);
    EXPECT_TRUE(failed_with(putcatent_r(db, &two_bits) == -1, EINVAL));
    EXPECT_EQ(is_cats_valid(db, 1 | (UINT64_C(1) << 63)), 0);
    EXPECT_EQ(is_cats_valid(db, 2), 1);
    EXPECT_EQ(rmcatnam_r(db, "a"), 0);
    EXPECT_EQ(is_cats_valid(db, 1), 1);
    ASSERT_EQ(closecatdb_r(db), 0);
}

TEST_F(FilesThroughLibvyr, UsersWithDefaultEntries) {
    void* db = openmacdb_r();
    ASSERT_NE(db, nullptr);
    const macent_t alice{const_cast<char*>("alice"), 2, 0x4, 6, 0x8};
    ASSERT_EQ(putmacent_r(db, &alice), 0);
    EXPECT_EQ(take(getmacnam_r(db, "alice")), "alice:2:4:6:8");
    // The back-end's ENOENT lets libvyr stand in an all-zero entry.
    EXPECT_EQ(take(getmacnam_r(db, "nobody-in-file")), "nobody-in-file:0:0:0:0");
    ASSERT_EQ(closemacdb_r(db), 0);
    EXPECT_TRUE(failed_with(getlchuid(0, nullptr) == -1, EOPNOTSUPP)) << "the files back-end has no lch hooks";
}

}  // namespace
