// The classic kernel calls against the scripted label service of
// support/kdouble: what they send, what they hand back, and which calls never
// reach the service.  mac_e2e_test.cc shows what survives on the real service.

#include "classic_test_util.h"
#include "support/failalloc.h"
#include "support/kdouble/kdouble.h"

#include <vyr/kernel.h>
#include <vyr/label.h>

#include <cerrno>
#include <cstdint>

using namespace classic_test;
using namespace kdouble;

namespace {

constexpr uint16_t kCcnr = VYR_TYPE_CCNR, kCcnri = VYR_TYPE_CCNRI, kEhole = VYR_TYPE_EHOLE;
constexpr const char *kPath = "/srv/data";
constexpr int kFd = 7, kPid = 4242;

class MacKernel : public ::testing::Test {
protected:
    void SetUp() override { svc = {}; }
    static const Call &last() { return svc.calls[svc.ncalls - 1]; }
};

// All six waivers, and only all six, reach the kernel as the flag ehole; the
// other flags go back as they were fetched.
TEST_F(MacKernel, ChmacWaiverRule) {
    const struct { uint32_t type_low; bool ehole; } cases[] = {
        {63, true}, {0x7f, true}, {0xbf, true}, {0x2d, false}, {0x3e, false}, {0, false}};
    for (uint16_t start : {kCcnr, uint16_t(kCcnri | kEhole | 0x100)})
        for (const auto &c : cases)
            for (bool by_fd : {false, true}) {
                svc = {};
                svc.labels = {Label{.type = start}};
                tavrel_mac_label_t rec{c.type_low, {9, 0x1234}};
                ASSERT_EQ(by_fd ? tavrel_fchmac(kFd, &rec) : tavrel_chmac(kPath, &rec), 0);
                ASSERT_EQ(svc.ncalls, 2u);
                EXPECT_EQ(svc.calls[0].cmd, by_fd ? VYR_CMD_GET_FD : VYR_CMD_GET_PATH);
                EXPECT_EQ(last().cmd, by_fd ? VYR_CMD_SET_FD : VYR_CMD_SET_PATH);
                EXPECT_EQ(last().target, by_fd ? uint64_t{kFd} : reinterpret_cast<uintptr_t>(kPath));
                EXPECT_TRUE(last().sent.lev == 9 && last().sent.cat == 0x1234u);
                EXPECT_EQ(last().sent.type, (start & ~kEhole) | (c.ehole ? kEhole : 0))
                    << std::hex << "type_low " << c.type_low << " start " << start;
            }
}

// One call of each shape (the path and descriptor forms share their code), on
// these records; each succeeds against an all-zero label.
tavrel_mac_label_t g_rec;
tavrel_mac_t g_prec;
using Call = int (*)();
const Call kCalls[] = {
    [] { return tavrel_chmac(kPath, &g_rec); },   [] { return tavrel_fstatmac(kFd, &g_rec); },
    [] { return tavrel_setmac(kPid, &g_prec); },  [] { return tavrel_getmac(kPid, &g_prec); },
    [] { return tavrel_fchmac_ign(kFd); },        [] { mac_t m{0x3f, 2, 2, 0x1003f}; return mac_set_file(kPath, &m); },
    [] { mac_t m{0, 2, 2, 0}; return mac_set_pid(kPid, &m); },
    [] { Mac m{mac_get_fd(kFd)}; return m ? 0 : -1; }, [] { Mac m{mac_get_pid(kPid)}; return m ? 0 : -1; }};

// A failed fetch ends the call: no write, records not filled, errno kept.  A
// service that won't open gives the getters NULL.
TEST_F(MacKernel, FetchFailureChangesNothing) {
    for (Call call : kCalls) {
        svc = {};
        svc.errs = {ENOENT};
        g_rec = {63, {1, 2}}, g_prec = {1, 2};
        expect_fail(call, ENOENT, "fetch");
        EXPECT_EQ(svc.ncalls, 1u);
        EXPECT_EQ(g_rec.type_low + g_rec.mac.lev + g_rec.mac.cat + g_prec.lev + g_prec.cat, 63u + 1 + 2 + 1 + 2);
    }
    svc = {};
    svc.open_err = EACCES;
    errno = 0;
    EXPECT_EQ(mac_get_file(kPath), nullptr);
    EXPECT_EQ(errno, EACCES);
    EXPECT_TRUE(mac_get_fd(kFd) == nullptr && mac_get_pid(kPid) == nullptr);
}

// The setters hand on the write's result unchanged; only the _ign forms flatten it to -1.
TEST_F(MacKernel, WriteResultComesBackAsIs) {
    tavrel_mac_label_t rec{0, {1, 1}};
    tavrel_mac_t prec{1, 1};
    Mac obj = make(1, 1, 0x10000), subj = make(1, 1, 0);
    svc.set_rc = 5;
    EXPECT_EQ(tavrel_chmac(kPath, &rec) + tavrel_fchmac(kFd, &rec) + tavrel_setmac(kPid, &prec), 15);
    EXPECT_EQ(mac_set_file(kPath, obj.get()) + mac_set_fd(kFd, obj.get()) + mac_set_pid(kPid, subj.get()), 15);
    EXPECT_EQ(tavrel_chmac_ign(kPath) + tavrel_fchmac_ign(kFd), -2);
}

// A value of the wrong class, or a NULL, is refused before any fetch.  A
// file's class must be 0x10000 exactly: 0x30000 has the bit but isn't it.
TEST_F(MacKernel, RefusedCallsNeverReachTheService) {
    Mac subject = make(1, 1, 0), object = make(1, 1, 0x10000), other = make(1, 1, 0x30000);
    auto pid = [](const mac_t *m) { return mac_set_pid(kPid, m); };
    auto file = [](const mac_t *m) { return mac_set_file(kPath, m); };
    auto fd = [](const mac_t *m) { return mac_set_fd(kFd, m); };
    const struct { int (*call)(const mac_t *); const mac_t *m; } cases[] = {
        {pid, object.get()}, {pid, other.get()}, {pid, nullptr}, {file, subject.get()}, {file, other.get()},
        {file, nullptr}, {fd, subject.get()}, {fd, other.get()}, {fd, nullptr},
        {[](const mac_t *m) { return mac_set_file(nullptr, m); }, object.get()},
        {[](const mac_t *) { return mac_get_file(nullptr) ? 0 : -1; }, nullptr},
    };
    for (const auto &c : cases) expect_fail([&] { return c.call(c.m); }, EINVAL);
    EXPECT_EQ(svc.ncalls, 0u);
}

// When memory runs out anywhere, nothing is written and nothing is left behind.
TEST_F(MacKernel, AllocationFailure) {
    for (Call call : kCalls) {
        vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
            svc = {};
            g_rec = {63, {2, 2}}, g_prec = {2, 2};
            const int rc = inj.run(call);
            EXPECT_EQ(rc, inj.fired() ? -1 : 0);
            EXPECT_FALSE(inj.fired() && svc.ncalls > 0 && !is_get(last().cmd));  // writes come last
        });
    }
}

}  // namespace
