// dbroute_init end to end: the file named by VYR_DBROUTE_CONF.
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <string>

#include <gtest/gtest.h>

#include "contract/dbroute.h"
#include "support/failalloc.h"
#include "support/scratch_dir.hh"

namespace {

class DbrouteInit : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_TRUE(dir_.ok());
        use_file(conf_);
        std::memset(&dbroute_cfg, 0, sizeof dbroute_cfg);
    }
    void TearDown() override { ::unsetenv("VYR_DBROUTE_CONF"); }

    void use_file(const std::string& path) { ::setenv("VYR_DBROUTE_CONF", path.c_str(), 1); }
    void write_conf(const std::string& text) { std::ofstream(conf_, std::ios::trunc) << text; }

    vyr_test::ScratchDir dir_;
    std::string conf_ = dir_ / "dbroute.conf";
};

TEST_F(DbrouteInit, LoadsTheNamedFileAndEachLoadReplacesTheWholeBlock) {
    write_conf("mac_backend = files\nfiles_dir = /srv/db\nmac_default_entry = 1\n");
    ASSERT_EQ(dbroute_init(), 0);
    EXPECT_STREQ(dbroute_cfg.mac_backend, "files");
    EXPECT_STREQ(dbroute_cfg.files_dir, "/srv/db");
    EXPECT_EQ(dbroute_cfg.mac_default_entry, 1u);
    // libvyr calls it again after every failed start-up: a repeat must agree.
    dbroute_cfg_t first;
    std::memcpy(&first, &dbroute_cfg, sizeof first);
    ASSERT_EQ(dbroute_init(), 0);
    EXPECT_EQ(std::memcmp(&first, &dbroute_cfg, sizeof first), 0);
    // Keys missing from a new file are cleared, not kept from the old one.
    write_conf("lev_backend = files\n");
    ASSERT_EQ(dbroute_init(), 0);
    EXPECT_STREQ(dbroute_cfg.mac_backend, "");
    EXPECT_EQ(dbroute_cfg.mac_default_entry, 0u);
    EXPECT_STREQ(dbroute_cfg.lev_backend, "files");
}

// A refused file leaves the block exactly as it was loaded before, sets
// errno, and names the file on stderr.
TEST_F(DbrouteInit, RefusedFileLeavesTheBlock) {
    const struct {
        std::string text;  // written to the configuration file first
        std::string path;  // then named by VYR_DBROUTE_CONF
        int err;
    } cases[] = {
        {"lev_backend = x\nbogus = 1\n", conf_, EINVAL},
        {std::string(2u << 20, '\n'), conf_, EFBIG},
        {"", dir_ / "missing", ENOENT},
        {"", dir_.path(), EISDIR},
    };
    for (const auto& c : cases) {
        use_file(conf_);
        write_conf("lev_backend = files\nfiles_dir = /srv/db\n");
        ASSERT_EQ(dbroute_init(), 0);
        dbroute_cfg_t before;
        std::memcpy(&before, &dbroute_cfg, sizeof before);
        write_conf(c.text);
        use_file(c.path);
        ::testing::internal::CaptureStderr();
        errno = 0;
        const int rc = dbroute_init();
        const int err = errno;
        const std::string diag = ::testing::internal::GetCapturedStderr();
        EXPECT_LT(rc, 0) << c.path;
        EXPECT_EQ(err, c.err) << c.path;
        EXPECT_EQ(std::memcmp(&before, &dbroute_cfg, sizeof before), 0) << c.path;
        EXPECT_NE(diag.find(c.path), std::string::npos) << diag;
    }
}

TEST_F(DbrouteInit, AllocationFailureLeavesBlockAndLeaksNothing) {
    write_conf("lev_backend = files\nfiles_dir = /srv/db\n");
    vyr_test::sweep_alloc_failures([&](vyr_test::Injector& inj) {
        std::memset(&dbroute_cfg, 0, sizeof dbroute_cfg);
        std::strcpy(dbroute_cfg.lev_backend, "old");
        // Only dbroute_init runs under injection: the capture allocates too.
        ::testing::internal::CaptureStderr();
        const int rc = inj.run([] { return dbroute_init(); });
        const int err = errno;
        ::testing::internal::GetCapturedStderr();
        if (inj.fired()) {
            EXPECT_LT(rc, 0);
            EXPECT_EQ(err, ENOMEM);
            EXPECT_STREQ(dbroute_cfg.lev_backend, "old");
            return;
        }
        EXPECT_EQ(rc, 0);
        EXPECT_STREQ(dbroute_cfg.lev_backend, "files");
    });
}

} // namespace
