// dbroute_init end to end: the file named by VYR_DBROUTE_CONF.
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <string>

#include <gtest/gtest.h>

#include "contract/dbroute.h"
#include "support/failalloc.h"

namespace {

class DbrouteInit : public ::testing::Test {
protected:
    void SetUp() override {
        char tmpl[] = "/tmp/dbroute-test-XXXXXX";
        ASSERT_NE(::mkdtemp(tmpl), nullptr);
        dir_ = tmpl;
        conf_ = dir_ + "/dbroute.conf";
        ::setenv("VYR_DBROUTE_CONF", conf_.c_str(), 1);
        std::memset(&dbroute_cfg, 0, sizeof dbroute_cfg);
    }
    void TearDown() override {
        ::unsetenv("VYR_DBROUTE_CONF");
        std::string cmd = "rm -rf '" + dir_ + "'";
        ASSERT_EQ(std::system(cmd.c_str()), 0);
    }
    void write_conf(const std::string& text) {
        std::ofstream(conf_, std::ios::trunc) << text;
    }
    // Loads a known configuration, then expects `text` to be refused with
    // `err` and the block to stay exactly as loaded.
    void expect_refused_unchanged(const std::string& text, int err) {
        write_conf("lev_backend = files\nfiles_dir = /srv/db\n");
        ASSERT_EQ(dbroute_init(), 0);
        dbroute_cfg_t before;
        std::memcpy(&before, &dbroute_cfg, sizeof before);
        write_conf(text);
        errno = 0;
        ::testing::internal::CaptureStderr();
        EXPECT_LT(dbroute_init(), 0);
        const int got = errno;
        const std::string diag = ::testing::internal::GetCapturedStderr();
        EXPECT_EQ(got, err) << std::strerror(got);
        EXPECT_EQ(std::memcmp(&before, &dbroute_cfg, sizeof before), 0);
        EXPECT_NE(diag.find(conf_), std::string::npos) << diag;
    }

    std::string dir_;
    std::string conf_;
};

TEST_F(DbrouteInit, LoadsFileAndRepeatedCallsAgree) {
    write_conf("mac_backend = files\nmac_charset = UTF-8\nlev_backend = files\n"
               "cat_backend = files\nfiles_dir = /srv/db\nmac_default_entry = 1\n");
    ASSERT_EQ(dbroute_init(), 0);
    dbroute_cfg_t first;
    std::memcpy(&first, &dbroute_cfg, sizeof first);
    EXPECT_STREQ(dbroute_cfg.mac_backend, "files");
    EXPECT_STREQ(dbroute_cfg.files_dir, "/srv/db");
    EXPECT_EQ(dbroute_cfg.mac_default_entry, 1u);
    ASSERT_EQ(dbroute_init(), 0);
    EXPECT_EQ(std::memcmp(&first, &dbroute_cfg, sizeof first), 0);
}

TEST_F(DbrouteInit, KeysMissingFromANewFileAreCleared) {
    write_conf("mac_backend = files\nmac_default_entry = 1\n");
    ASSERT_EQ(dbroute_init(), 0);
    write_conf("lev_backend = files\n");
    ASSERT_EQ(dbroute_init(), 0);
    EXPECT_STREQ(dbroute_cfg.mac_backend, "");
    EXPECT_EQ(dbroute_cfg.mac_default_entry, 0u);
    EXPECT_STREQ(dbroute_cfg.lev_backend, "files");
}

TEST_F(DbrouteInit, UnknownKeyLeavesBlock) { expect_refused_unchanged("lev_backend = x\nbogus = 1\n", EINVAL); }

TEST_F(DbrouteInit, TooLongValueLeavesBlock) {
    expect_refused_unchanged("mac_charset = " + std::string(64, 'c') + "\n", ENAMETOOLONG);
}

TEST_F(DbrouteInit, SlashInBackendLeavesBlock) { expect_refused_unchanged("cat_backend = a/b\n", EINVAL); }

TEST_F(DbrouteInit, RelativeDirLeavesBlock) { expect_refused_unchanged("files_dir = db\n", EINVAL); }

TEST_F(DbrouteInit, OversizedFileLeavesBlock) {
    expect_refused_unchanged(std::string(2u << 20, '\n'), EFBIG);
}

TEST_F(DbrouteInit, MissingFileLeavesBlock) {
    write_conf("lev_backend = files\n");
    ASSERT_EQ(dbroute_init(), 0);
    ASSERT_EQ(::unlink(conf_.c_str()), 0);
    errno = 0;
    ::testing::internal::CaptureStderr();
    EXPECT_LT(dbroute_init(), 0);
    EXPECT_EQ(errno, ENOENT);
    ::testing::internal::GetCapturedStderr();
    EXPECT_STREQ(dbroute_cfg.lev_backend, "files");
}

TEST_F(DbrouteInit, DirectoryIsNoConfiguration) {
    ::setenv("VYR_DBROUTE_CONF", dir_.c_str(), 1);
    errno = 0;
    ::testing::internal::CaptureStderr();
    EXPECT_LT(dbroute_init(), 0);
    EXPECT_EQ(errno, EISDIR);
    ::testing::internal::GetCapturedStderr();
}

TEST_F(DbrouteInit, UnreadableFileIsRefused) {
    write_conf("lev_backend = files\n");
    ASSERT_EQ(::chmod(conf_.c_str(), 0), 0);
    ASSERT_EQ(::chmod(dir_.c_str(), 0755), 0);
    // Permissions do not bind root: try as an ordinary user in a child.
    const pid_t pid = ::fork();
    if (pid == 0) {
        if (::geteuid() == 0 && (::setgid(65534) != 0 || ::setuid(65534) != 0)) ::_exit(100);
        std::strcpy(dbroute_cfg.lev_backend, "kept");
        ::freopen("/dev/null", "w", stderr);
        const int rc = dbroute_init();
        ::_exit(rc < 0 && std::strcmp(dbroute_cfg.lev_backend, "kept") == 0 ? errno : 0);
    }
    ASSERT_GT(pid, 0);
    int status = 0;
    ASSERT_EQ(::waitpid(pid, &status, 0), pid);
    ASSERT_TRUE(WIFEXITED(status));
    if (WEXITSTATUS(status) == 100) GTEST_SKIP() << "cannot switch to an ordinary user here";
    EXPECT_EQ(WEXITSTATUS(status), EACCES);
}

TEST_F(DbrouteInit, AllocationFailureLeavesBlockAndLeaksNothing) {
    write_conf("lev_backend = old\n");
    ASSERT_EQ(dbroute_init(), 0);
    write_conf("lev_backend = files\nfiles_dir = /srv/db\n");
    vyr_test::sweep_alloc_failures([&](vyr_test::Injector& inj) {
        std::memset(dbroute_cfg.lev_backend, 0, sizeof dbroute_cfg.lev_backend);
        std::strcpy(dbroute_cfg.lev_backend, "old");
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

}  // namespace
