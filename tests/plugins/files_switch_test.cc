// The files back-end behind libvyr's database functions: loaded by name from
// the configuration, with libvyr's own checks and default entries on top.
// Start-up state is per process, so every test here shares one configuration
// made before the first database call.
#include <dlfcn.h>

#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <fstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <vyr/namedb.h>

#include "files_fixture.hh"

namespace {

using namespace files_test;

class FilesThroughLibvyr : public ::testing::Test {
protected:
    static void SetUpTestSuite() {
        char tmpl[] = "/tmp/files-switch-XXXXXX";
        ASSERT_NE(::mkdtemp(tmpl), nullptr);
        dir_ = tmpl;
        const std::string conf = dir_ + "/dbroute.conf";
        std::ofstream(conf) << "mac_backend = files\nlev_backend = files\ncat_backend = files\n"
                               "mac_charset = UTF-8\nlev_charset = UTF-8\ncat_charset = UTF-8\n"
                               "mac_default_entry = 1\nfiles_dir = "
                            << dir_ << "\n";
        ::setenv("VYR_DBROUTE_CONF", conf.c_str(), 1);
#if defined(__SANITIZE_ADDRESS__)
        // AddressSanitizer intercepts dlopen, which then searches as if
        // called from the sanitizer's runtime instead of from libvyr, so
        // libvyr's $ORIGIN is not searched. Loading the plug-in by path first
        // lets libvyr's dlopen by bare name find it already loaded.
        ASSERT_NE(::dlopen(FILES_PLUGIN_PATH, RTLD_NOW), nullptr) << ::dlerror();
#endif
    }
    static void TearDownTestSuite() {
        const std::string cmd = "rm -rf '" + dir_ + "'";
        ASSERT_EQ(std::system(cmd.c_str()), 0);
    }
    static std::string dir_;
};
std::string FilesThroughLibvyr::dir_;

TEST_F(FilesThroughLibvyr, Levels) {
    void* db = openlevdb_r();
    ASSERT_NE(db, nullptr) << std::strerror(errno);
    const levent_t low{const_cast<char*>("low"), 1};
    const levent_t high{const_cast<char*>("high"), 200};
    ASSERT_EQ(putlevent_r(db, &low), 0);
    ASSERT_EQ(putlevent_r(db, &high), 0);
    EXPECT_EQ(read_text(dir_ + "/levels"), "low:1\nhigh:200\n");

    LevPtr by_name{getlevnam_r(db, "high")};
    ASSERT_NE(by_name, nullptr);
    EXPECT_EQ(by_name->value, 200);
    LevPtr by_value{getlevval_r(db, 256 + 1)};
    ASSERT_NE(by_value, nullptr);
    EXPECT_STREQ(by_value->name, "low");

    std::vector<std::string> walked;
    ASSERT_EQ(setlevent_r(db), 0);
    while (LevPtr e{getlevent_r(db)}) walked.push_back(e->name);
    endlevent_r(db);
    EXPECT_EQ(walked, (std::vector<std::string>{"low", "high"}));
    ASSERT_EQ(closelevdb_r(db), 0);

    EXPECT_EQ(levexstval(nullptr, 200), 0);
    EXPECT_EQ(levexstval(nullptr, 3), 1);
}

TEST_F(FilesThroughLibvyr, Categories) {
    void* db = opencatdb_r();
    ASSERT_NE(db, nullptr);
    const catent_t a{const_cast<char*>("a"), 1};
    const catent_t top{const_cast<char*>("top"), UINT64_C(1) << 63};
    const catent_t two_bits{const_cast<char*>("two"), 3};
    ASSERT_EQ(putcatent_r(db, &a), 0);
    ASSERT_EQ(putcatent_r(db, &top), 0);
    errno = 0;
    EXPECT_EQ(putcatent_r(db, &two_bits), -1);
    EXPECT_EQ(errno, EINVAL);
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
    MacPtr known{getmacnam_r(db, "alice")};
    ASSERT_NE(known, nullptr);
    EXPECT_EQ(known->lev2, 6);
    EXPECT_EQ(known->cat2, 8u);
    // The back-end's ENOENT lets libvyr stand in an all-zero entry.
    MacPtr unknown{getmacnam_r(db, "nobody-in-file")};
    ASSERT_NE(unknown, nullptr);
    EXPECT_STREQ(unknown->name, "nobody-in-file");
    EXPECT_EQ(unknown->lev1 | unknown->lev2, 0);
    EXPECT_EQ(unknown->cat1 | unknown->cat2, 0u);
    ASSERT_EQ(closemacdb_r(db), 0);

    errno = 0;
    EXPECT_EQ(getlchuid(0, nullptr), -1);  // the files back-end has no lch hooks
    EXPECT_EQ(errno, EOPNOTSUPP);
}

}  // namespace
