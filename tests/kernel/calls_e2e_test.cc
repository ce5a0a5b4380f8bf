// Kernel label calls end to end, against the real service stand-in: a label
// set on a file, a link, a descriptor or this process reads back equal, here
// and from a second process (kernel_label_probe).
//
// The program runs twice: with the attribute namespace "user" (any user),
// and with "trusted", which needs root but lets a symbolic link carry a
// label of its own.

#include <vyr/kernel.h>
#include <vyr/label.h>
#include <vyr/raw.h>

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <memory>
#include <string>
#include <vector>

namespace {

namespace fs = std::filesystem;

struct Put {
    void operator()(vyrl_t *l) const { vyrl_put(l); }
};
using LabelPtr = std::unique_ptr<vyrl_t, Put>;

std::string xattr_namespace() {
    const char *ns = std::getenv("VYR_TAVREL_XATTR_NS");
    return ns != nullptr ? ns : "security";
}

// A label with a 64-byte blob and both role lists.
LabelPtr sample_label(uint8_t seed) {
    const vyr_role_t r1[] = {{100u + seed, 1, 7}, {50, 2, 3}};
    const vyr_role_t r2[] = {{9, 0xffffffffu, 0xff}};
    LabelPtr l(vyrl_get_new_init_mac_roles(3, 2, 0x8000000000000005u | seed, 4, r1, 2, r2, 1));
    if (!l) return l;
    auto *blob = static_cast<unsigned char *>(std::malloc(64));
    for (int i = 0; i < 64; ++i) blob[i] = static_cast<unsigned char>(seed * 3 + i);
    l->ml->blob = blob;
    l->ml->blob_size = 64;
    return l;
}

// Runs the probe in a second process and reads its label back.
LabelPtr probe(const std::string &mode, const std::string &target) {
    const char *prog = std::getenv("VYR_KERNEL_PROBE");
    if (prog == nullptr) {
        ADD_FAILURE() << "VYR_KERNEL_PROBE is not set";
        return nullptr;
    }
    int pipefd[2];
    if (pipe(pipefd) != 0) return nullptr;
    const pid_t pid = fork();
    if (pid == 0) {
        dup2(pipefd[1], STDOUT_FILENO);
        close(pipefd[0]);
        close(pipefd[1]);
        execl(prog, prog, mode.c_str(), target.c_str(), static_cast<char *>(nullptr));
        _exit(127);
    }
    close(pipefd[1]);
    std::string out;
    char buf[512];
    ssize_t n;
    while ((n = read(pipefd[0], buf, sizeof buf)) > 0) out.append(buf, static_cast<size_t>(n));
    close(pipefd[0]);
    int status = 0;
    waitpid(pid, &status, 0);
    if (!WIFEXITED(status) || WEXITSTATUS(status) != 0) {
        ADD_FAILURE() << "probe " << mode << " " << target << " failed: " << out;
        return nullptr;
    }
    std::vector<uint8_t> raw;
    for (size_t i = 0; i + 1 < out.size() && out[i] != '\n'; i += 2)
        raw.push_back(static_cast<uint8_t>(std::stoul(out.substr(i, 2), nullptr, 16)));
    return LabelPtr(vyrl_get_from_raw(raw.data(), raw.size()));
}

::testing::AssertionResult same_label(const vyrl_t *got, const vyrl_t *want) {
    if (got == nullptr) return ::testing::AssertionFailure() << "no label";
    if (vyrl_cmp(got, want, 0) != 1)
        return ::testing::AssertionFailure()
               << "labels differ: lev " << int{got->ml->lev} << " type " << got->ml->type << " blob "
               << got->ml->blob_size << " roles " << got->rl->nroles1 << "/" << got->rl->nroles2;
    return ::testing::AssertionSuccess();
}

// One suite name per namespace, so that both programs' tests can be told
// apart in one test run.
#ifndef VYR_E2E_SUITE
#define VYR_E2E_SUITE KernelEndToEnd
#endif

class VYR_E2E_SUITE : public ::testing::Test {
protected:
    // Before the first call opens the service, which reads its settings once.
    static void SetUpTestSuite() {
#ifdef VYR_E2E_NS
        setenv("VYR_TAVREL_XATTR_NS", VYR_E2E_NS, 1);
        setenv("VYR_TAVREL_STATE_DIR", VYR_E2E_STATE_DIR, 0);  // a caller's own wins
        setenv("VYR_KERNEL_PROBE", VYR_E2E_PROBE, 1);
#endif
    }

    void SetUp() override {
        char tmpl[] = "/tmp/vyr-kernel-e2e-XXXXXX";
        ASSERT_NE(mkdtemp(tmpl), nullptr);
        dir_ = tmpl;
        file_ = dir_ / "file";
        link_ = dir_ / "link";
        const int fd = open(file_.c_str(), O_CREAT | O_WRONLY, 0600);
        ASSERT_GE(fd, 0);
        close(fd);
        ASSERT_EQ(symlink(file_.c_str(), link_.c_str()), 0);
        // The file system must take attributes in the chosen namespace.
        const std::string probe_attr = xattr_namespace() + ".vyr-probe";
        if (setxattr(file_.c_str(), probe_attr.c_str(), "x", 1, 0) != 0)
            GTEST_SKIP() << "no " << xattr_namespace() << " attributes here: " << std::strerror(errno);
        removexattr(file_.c_str(), probe_attr.c_str());
    }
    void TearDown() override {
        std::error_code ec;
        fs::remove_all(dir_, ec);
    }

    fs::path dir_, file_, link_;
};

TEST_F(VYR_E2E_SUITE, FileWithoutLabelReadsAsZero) {
    LabelPtr got(vyr_get_path(file_.c_str()));
    EXPECT_TRUE(same_label(got.get(), VYRL_ZERO));
}

TEST_F(VYR_E2E_SUITE, MissingFile) {
    errno = 0;
    EXPECT_EQ(vyr_get_path((dir_ / "nothing").c_str()), nullptr);
    EXPECT_EQ(errno, ENOENT);
    LabelPtr l = sample_label(1);
    EXPECT_NE(vyr_set_path((dir_ / "nothing").c_str(), l.get()), 0);
}

TEST_F(VYR_E2E_SUITE, PathSetThenGetHereAndElsewhere) {
    LabelPtr l = sample_label(1);
    ASSERT_TRUE(l);
    ASSERT_EQ(vyr_set_path(file_.c_str(), l.get()), 0);
    EXPECT_EQ(vyrl_ucnt(l.get()), 1);
    LabelPtr got(vyr_get_path(file_.c_str()));
    EXPECT_TRUE(same_label(got.get(), l.get()));
    LabelPtr other = probe("path", file_.string());
    EXPECT_TRUE(same_label(other.get(), l.get()));

    // A smaller label replaces it entirely.
    LabelPtr small(vyrl_get_new_init_mac(1, 0, 2, 0));
    ASSERT_EQ(vyr_set_path(file_.c_str(), small.get()), 0);
    LabelPtr again(vyr_get_path(file_.c_str()));
    EXPECT_TRUE(same_label(again.get(), small.get()));
}

TEST_F(VYR_E2E_SUITE, DescriptorSetThenGet) {
    LabelPtr l = sample_label(2);
    ASSERT_TRUE(l);
    const int fd = open(file_.c_str(), O_RDONLY);
    ASSERT_GE(fd, 0);
    EXPECT_EQ(vyr_set_fd(fd, l.get()), 0);
    LabelPtr got(vyr_get_fd(fd));
    EXPECT_TRUE(same_label(got.get(), l.get()));
    close(fd);
    LabelPtr by_path(vyr_get_path(file_.c_str()));
    EXPECT_TRUE(same_label(by_path.get(), l.get()));
    LabelPtr other = probe("fd", file_.string());
    EXPECT_TRUE(same_label(other.get(), l.get()));

    errno = 0;
    EXPECT_EQ(vyr_get_fd(-1), nullptr);
    EXPECT_EQ(errno, EBADF);
}

// The path commands follow a final link; the lpath commands take the link.
TEST_F(VYR_E2E_SUITE, LinkFollowedByPathNotByLpath) {
    LabelPtr l = sample_label(3);
    ASSERT_TRUE(l);
    ASSERT_EQ(vyr_set_path(link_.c_str(), l.get()), 0);
    LabelPtr target(vyr_get_path(file_.c_str()));
    EXPECT_TRUE(same_label(target.get(), l.get()));
    LabelPtr through(vyr_get_path(link_.c_str()));
    EXPECT_TRUE(same_label(through.get(), l.get()));
    LabelPtr itself(vyr_get_lpath(link_.c_str()));
    ASSERT_NE(itself, nullptr);
    EXPECT_EQ(vyrl_cmp(itself.get(), l.get(), 0), 0);

    LabelPtr mark = sample_label(4);
    if (xattr_namespace() == "user") {
        // Links take no user attributes: setting one fails and changes nothing.
        errno = 0;
        EXPECT_NE(vyr_set_lpath(link_.c_str(), mark.get()), 0);
        EXPECT_EQ(errno, EPERM);
        LabelPtr still(vyr_get_path(file_.c_str()));
        EXPECT_TRUE(same_label(still.get(), l.get()));
        return;
    }
    ASSERT_EQ(vyr_set_lpath(link_.c_str(), mark.get()), 0);
    LabelPtr link_label(vyr_get_lpath(link_.c_str()));
    EXPECT_TRUE(same_label(link_label.get(), mark.get()));
    LabelPtr file_label(vyr_get_path(link_.c_str()));
    EXPECT_TRUE(same_label(file_label.get(), l.get()));
    LabelPtr other = probe("lpath", link_.string());
    EXPECT_TRUE(same_label(other.get(), mark.get()));
}

TEST_F(VYR_E2E_SUITE, OwnProcess) {
    LabelPtr l = sample_label(5);
    ASSERT_TRUE(l);
    ASSERT_EQ(vyr_set_pid(getpid(), l.get()), 0);
    LabelPtr got(vyr_get_pid(getpid()));
    EXPECT_TRUE(same_label(got.get(), l.get()));
    LabelPtr other = probe("pid", std::to_string(getpid()));
    EXPECT_TRUE(same_label(other.get(), l.get()));
}

// The system maximum operations stamp the target with the label of "/"
// under a new type word.
TEST_F(VYR_E2E_SUITE, SystemMaximumLabels) {
    LabelPtr root(vyr_get_path("/"));
    ASSERT_TRUE(root);
    struct Case {
        const char *name;
        int (*stamp)(const std::string &);
        uint16_t type;
        bool clears_ilev;
    };
    const Case cases[] = {
        {"path", [](const std::string &p) { return vyr_set_sys_max_path(p.c_str()); }, 7, false},
        {"ccnr path", [](const std::string &p) { return vyr_set_sys_max_ccnr_path(p.c_str()); }, 1, true},
        {"fd",
         [](const std::string &p) {
             const int fd = open(p.c_str(), O_RDONLY);
             const int rc = vyr_set_sys_max_fd(fd);
             close(fd);
             return rc;
         },
         7, false},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        LabelPtr before = sample_label(6);
        ASSERT_EQ(vyr_set_path(file_.c_str(), before.get()), 0);
        ASSERT_EQ(c.stamp(file_.string()), 0);
        LabelPtr want(vyrl_dup(root.get()));
        ASSERT_TRUE(want);
        vyrl_set_type(want.get(), c.type);
        if (c.clears_ilev) vyrl_set_ilev(want.get(), 0);
        LabelPtr got(vyr_get_path(file_.c_str()));
        EXPECT_TRUE(same_label(got.get(), want.get()));
    }
}

}  // namespace
