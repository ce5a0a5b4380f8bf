// The classic kernel calls end to end on the real service stand-in, with
// file labels in the user attribute namespace and process labels in a state
// directory of the build tree.

#include "classic_test_util.h"

#include <vyr/kernel.h>
#include <vyr/label.h>

#include <gtest/gtest.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <string>
#include <sys/stat.h>
#include <unistd.h>

using namespace classic_test;

namespace {

struct LabelPut {
    void operator()(vyrl_t *l) const { vyrl_put(l); }
};
using Label = std::unique_ptr<vyrl_t, LabelPut>;

constexpr uint16_t kCcnr = VYR_TYPE_CCNR, kEhole = VYR_TYPE_EHOLE;
const vyr_role_t kRoles1[] = {{50, 5, 1}, {10, 0, 3}};
const vyr_role_t kRoles2[] = {{7, 9, 2}};
const char kBlob[] = "opaque";

// A label holding everything the classic calls leave alone.
Label rich_label(uint8_t lev, uint64_t cat, uint16_t type) {
    Label l{vyrl_get_new_init_mac_roles(lev, 3, cat, type, kRoles1, 2, kRoles2, 1)};
    EXPECT_NE(l, nullptr);
    vyrml_t *ml = l->ml;
    ml->blob = static_cast<uint8_t *>(std::malloc(sizeof kBlob));
    std::memcpy(ml->blob, kBlob, sizeof kBlob);
    ml->blob_size = sizeof kBlob;
    return l;
}

// Everything but level, categories and type is as rich_label made it.
void expect_rest_survived(const vyrl_t *got) {
    EXPECT_EQ(vyrl_ilev(got), 3);
    ASSERT_EQ(got->ml->blob_size, sizeof kBlob);
    EXPECT_EQ(std::memcmp(got->ml->blob, kBlob, sizeof kBlob), 0);
    ASSERT_EQ(got->rl->nroles1, 2u);
    ASSERT_EQ(got->rl->nroles2, 1u);
    EXPECT_EQ(got->rl->roles1[0].id, 50u);
    EXPECT_EQ(got->rl->roles1[1].rights, 3);
    EXPECT_EQ(got->rl->roles2[0].attr, 9u);
}

std::string build_dir() {
    const char *build = std::getenv("VYR_TEST_BUILD_DIR");
    return build ? build : "/tmp";
}

// The stand-in keeps file labels in user attributes, which anyone may set,
// and process labels under the build tree.  Set before the first call.
class Env : public ::testing::Environment {
    void SetUp() override {
        std::string tmp = build_dir() + "/tmp";
        std::string state = tmp + "/classic-e2e-state";
        ::mkdir(tmp.c_str(), 0755);
        ::mkdir(state.c_str(), 0755);
        ::setenv("VYR_TAVREL_XATTR_NS", "user", 1);
        ::setenv("VYR_TAVREL_STATE_DIR", state.c_str(), 1);
        use_db_config("e2e", "# no back-ends configured\n");
    }
};
const auto *const g_env = ::testing::AddGlobalTestEnvironment(new Env);

class MacE2e : public ::testing::Test {
protected:
    void SetUp() override {
        path_ = build_dir() + "/tmp/classic-e2e-" + std::to_string(::getpid()) + "-" +
                ::testing::UnitTest::GetInstance()->current_test_info()->name();
        int fd = ::open(path_.c_str(), O_CREAT | O_TRUNC | O_WRONLY, 0644);
        ASSERT_GE(fd, 0);
        ::close(fd);
    }
    void TearDown() override { ::unlink(path_.c_str()); }

    Label fetch() const {
        Label l{vyr_get_path(path_.c_str())};
        EXPECT_NE(l, nullptr) << std::strerror(errno);
        return l;
    }

    std::string path_;
};

TEST_F(MacE2e, PathCallsKeepWhatTheyCannotExpress) {
    ASSERT_EQ(vyr_set_path(path_.c_str(), rich_label(2, 0xc, kCcnr).get()), 0);

    tavrel_mac_label_t rec{63, {9, 0x300}};
    ASSERT_EQ(tavrel_chmac(path_.c_str(), &rec), 0);
    Label got = fetch();
    ASSERT_NE(got, nullptr);
    EXPECT_EQ(vyrl_lev(got.get()), 9);
    EXPECT_EQ(vyrl_cat(got.get()), 0x300u);
    EXPECT_EQ(vyrl_type(got.get()), kCcnr | kEhole);
    expect_rest_survived(got.get());

    tavrel_mac_label_t back{};
    ASSERT_EQ(tavrel_statmac(path_.c_str(), &back), 0);
    EXPECT_EQ(back.type_low, 63u);
    EXPECT_EQ(back.mac.lev, 9);
    EXPECT_EQ(back.mac.cat, 0x300u);

    rec.type_low = 0x2d;  // partial waivers clear the flag
    ASSERT_EQ(tavrel_chmac(path_.c_str(), &rec), 0);
    ASSERT_EQ(tavrel_statmac(path_.c_str(), &back), 0);
    EXPECT_EQ(back.type_low, 0u);
    got = fetch();
    EXPECT_EQ(vyrl_type(got.get()), kCcnr);
    expect_rest_survived(got.get());

    ASSERT_EQ(tavrel_chmac_ign(path_.c_str()), 0);
    ASSERT_EQ(tavrel_statmac(path_.c_str(), &back), 0);
    EXPECT_EQ(back.type_low, 63u);
    EXPECT_EQ(back.mac.lev, 0);
    EXPECT_EQ(back.mac.cat, 0u);
    expect_rest_survived(fetch().get());
}

TEST_F(MacE2e, ValuesThroughPathAndDescriptor) {
    ASSERT_EQ(vyr_set_path(path_.c_str(), rich_label(1, 1, 0).get()), 0);
    int fd = ::open(path_.c_str(), O_RDONLY);
    ASSERT_GE(fd, 0);
    struct Case {
        uint32_t set, got;
    } cases[] = {{0x1003f, 0x1003f}, {0x1002d, 0x10000}, {0x10000, 0x10000}};
    for (const Case &c : cases) {
        for (bool by_fd : {false, true}) {
            Mac m = make(6, 0x60, c.set);
            ASSERT_EQ(by_fd ? mac_set_fd(fd, m.get()) : mac_set_file(path_.c_str(), m.get()), 0);
            // Read back the other way round.
            Mac back{by_fd ? mac_get_file(path_.c_str()) : mac_get_fd(fd)};
            ASSERT_NE(back, nullptr);
            EXPECT_EQ(back->type, c.got);
            EXPECT_EQ(back->lev, 6);
            EXPECT_EQ(back->cat, 0x60u);
        }
    }
    ::close(fd);
    expect_rest_survived(fetch().get());
}

TEST_F(MacE2e, ProcessLabel) {
    const int pid = ::getpid();
    ASSERT_EQ(vyr_set_pid(pid, rich_label(1, 1, kEhole).get()), 0) << std::strerror(errno);
    tavrel_mac_t rec{12, 0xabc};
    ASSERT_EQ(tavrel_setmac(pid, &rec), 0);
    Label got{vyr_get_pid(pid)};
    ASSERT_NE(got, nullptr);
    EXPECT_EQ(vyrl_lev(got.get()), 12);
    EXPECT_EQ(vyrl_cat(got.get()), 0xabcu);
    EXPECT_EQ(vyrl_type(got.get()), kEhole);  // a process keeps its flags
    expect_rest_survived(got.get());

    Mac m{mac_get_pid(pid)};
    ASSERT_NE(m, nullptr);
    EXPECT_EQ(m->type, 0u);
    EXPECT_EQ(m->lev, 12);
    Mac next = make(4, 4, 0);
    ASSERT_EQ(mac_set_pid(pid, next.get()), 0);
    tavrel_mac_t after{};
    ASSERT_EQ(tavrel_getmac(pid, &after), 0);
    EXPECT_EQ(after.lev, 4);
    EXPECT_EQ(after.cat, 4u);
}

TEST_F(MacE2e, MissingFileFailsWithoutFilling) {
    std::string missing = path_ + ".absent";
    tavrel_mac_label_t rec{5, {5, 5}};
    errno = 0;
    EXPECT_EQ(tavrel_statmac(missing.c_str(), &rec), -1);
    EXPECT_NE(errno, 0);
    EXPECT_EQ(rec.type_low, 5u);
    EXPECT_EQ(rec.mac.lev, 5);
    EXPECT_EQ(tavrel_chmac(missing.c_str(), &rec), -1);
    EXPECT_EQ(mac_get_file(missing.c_str()), nullptr);
    struct stat st;
    EXPECT_NE(::stat(missing.c_str(), &st), 0);
}

}  // namespace
