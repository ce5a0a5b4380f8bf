// The classic kernel calls end to end on the real service stand-in (file
// labels in the user attribute namespace, process labels in a scratch
// directory): the parts of a label the classic interface can't express survive every call.

#include "classic_test_util.h"
#include "support/labels.hh"
#include "support/scratch_dir.hh"

#include <vyr/kernel.h>
#include <vyr/label.h>

#include <cstring>
#include <fcntl.h>
#include <fstream>
#include <string>
#include <unistd.h>

using namespace classic_test;

namespace {

using vyr_test::Label;

constexpr uint16_t kCcnr = VYR_TYPE_CCNR, kEhole = VYR_TYPE_EHOLE;
const vyr_role_t kRoles1[] = {{50, 5, 1}, {10, 0, 3}}, kRoles2[] = {{7, 9, 2}};
const char kBlob[] = "opaque";

// A label holding integrity, a byte string and roles besides `type`.
Label rich_label(uint16_t type) {
    Label l{vyrl_get_new_init_mac_roles(1, 3, 1, type, kRoles1, 2, kRoles2, 1)};
    l->ml->blob = static_cast<uint8_t *>(std::malloc(sizeof kBlob));
    std::memcpy(l->ml->blob, kBlob, sizeof kBlob);
    l->ml->blob_size = sizeof kBlob;
    return l;
}

// The label holds these level, categories and flags, and the rest as rich_label made it.
void expect_label(const vyrl_t *got, uint8_t lev, uint64_t cat, uint16_t type) {
    Label want = rich_label(type);
    vyrl_set_lev(want.get(), lev);
    vyrl_set_cat(want.get(), cat);
    ASSERT_NE(got, nullptr) << std::strerror(errno);
    EXPECT_EQ(vyrl_cmp(got, want.get(), 0), 1) << int{vyrl_lev(got)} << " " << vyrl_cat(got) << " " << vyrl_type(got);
}

// The stand-in reads its settings when the channel opens: set before the first call.
const vyr_test::ScratchDir &scratch() {
    static const vyr_test::ScratchDir dir;
    return dir;
}

class Env : public ::testing::Environment {
    void SetUp() override {
        ASSERT_TRUE(scratch().ok());
        ::setenv("VYR_TAVREL_XATTR_NS", "user", 1);
        ::setenv("VYR_TAVREL_STATE_DIR", scratch().path().c_str(), 1);
    }
};
const auto *const g_env = ::testing::AddGlobalTestEnvironment(new Env);

// Each test starts with a file of its own that carries rich_label(ccnr).
class MacE2e : public ::testing::Test {
protected:
    void SetUp() override {
        path_ = scratch() / ::testing::UnitTest::GetInstance()->current_test_info()->name();
        std::ofstream{path_};
        ASSERT_EQ(vyr_set_path(p(), rich_label(kCcnr).get()), 0) << std::strerror(errno);
    }
    const char *p() const { return path_.c_str(); }
    Label fetch() const { return Label{vyr_get_path(p())}; }
    std::string path_;
};

TEST_F(MacE2e, PathCallsKeepWhatTheyCannotExpress) {
    const struct { uint32_t type_low; uint8_t lev; uint64_t cat; uint16_t type; } steps[] = {
        {63, 9, 0x300, kCcnr | kEhole}, {0x2d, 9, 0x300, kCcnr}, {0xff, 0, 0, kCcnr | kEhole}};  // 0xff: chmac_ign
    for (const auto &s : steps) {
        tavrel_mac_label_t rec{s.type_low, {s.lev, s.cat}}, back{};
        ASSERT_EQ(s.type_low == 0xff ? tavrel_chmac_ign(p()) : tavrel_chmac(p(), &rec), 0);
        expect_label(fetch().get(), s.lev, s.cat, s.type);
        ASSERT_EQ(tavrel_statmac(p(), &back), 0);
        EXPECT_EQ(back.type_low, s.type & kEhole ? 63u : 0u);  // partial waivers don't survive
        EXPECT_TRUE(back.mac.lev == s.lev && back.mac.cat == s.cat);
    }
}

TEST_F(MacE2e, ValuesThroughPathAndDescriptor) {
    int fd = ::open(p(), O_RDONLY);
    ASSERT_GE(fd, 0);
    for (auto [set, got] : {std::pair{0x1003fu, 0x1003fu}, {0x1002du, 0x10000u}, {0x100ffu, 0x1003fu}})
        for (bool by_fd : {false, true}) {
            Mac m = make(6, 0x60, set);
            ASSERT_EQ(by_fd ? mac_set_fd(fd, m.get()) : mac_set_file(p(), m.get()), 0);
            Mac back{by_fd ? mac_get_file(p()) : mac_get_fd(fd)};  // read back the other way
            EXPECT_EQ(str(back.get()), str(make(6, 0x60, got).get())) << std::hex << set;
        }
    ::close(fd);
    expect_label(fetch().get(), 6, 0x60, kCcnr | kEhole);
}

TEST_F(MacE2e, ProcessLabel) {
    const int pid = ::getpid();
    ASSERT_EQ(vyr_set_pid(pid, rich_label(kEhole).get()), 0) << std::strerror(errno);
    tavrel_mac_t rec{12, 0xabc}, after{};
    ASSERT_EQ(tavrel_setmac(pid, &rec), 0);
    expect_label(Label{vyr_get_pid(pid)}.get(), 12, 0xabc, kEhole);  // a process keeps its flags
    EXPECT_EQ(str(Mac{mac_get_pid(pid)}.get()), "12 abc 0");
    ASSERT_EQ(mac_set_pid(pid, make(4, 4, 0).get()), 0);
    ASSERT_EQ(tavrel_getmac(pid, &after), 0);
    EXPECT_TRUE(after.lev == 4 && after.cat == 4u);
}

}  // namespace
