// The classic kernel calls against the scripted label service of
// support/kdouble: what they send, what they hand back, and which calls never
// reach the service.  What they read, and what survives in a whole label,
// mac_e2e_test.cc shows on the real service.

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
constexpr int kFd = 7;
constexpr int kPid = 4242;

class MacKernel : public ::testing::Test {
protected:
    void SetUp() override { svc = {}; }
    static const Call &last() { return svc.calls[svc.ncalls - 1]; }
};

// All six waivers, and only all six, reach the kernel as the flag ehole;
// the other flags go back as they were fetched.
TEST_F(MacKernel, ChmacWaiverRule) {
    const struct { uint32_t type_low; bool ehole; } cases[] = {
        {63, true}, {0x7f, true}, {0xbf, true}, {0x2d, false}, {0x3e, false}, {0, false}};
    for (uint16_t start : {kCcnr, uint16_t(kCcnri | kEhole | 0x100)}) {
        for (const auto &c : cases) {
            for (bool by_fd : {false, true}) {
                svc = {};
                svc.labels = {Label{.type = start}};
                tavrel_mac_label_t rec{c.type_low, {9, 0x1234}};
                ASSERT_EQ(by_fd ? tavrel_fchmac(kFd, &rec) : tavrel_chmac(kPath, &rec), 0);
                ASSERT_EQ(svc.ncalls, 2u);
                EXPECT_EQ(svc.calls[0].cmd, by_fd ? VYR_CMD_GET_FD : VYR_CMD_GET_PATH);
                EXPECT_EQ(last().cmd, by_fd ? VYR_CMD_SET_FD : VYR_CMD_SET_PATH);
                EXPECT_EQ(last().target, by_fd ? uint64_t{kFd} : reinterpret_cast<uintptr_t>(kPath));
                EXPECT_EQ(last().sent.lev, 9);
                EXPECT_EQ(last().sent.cat, 0x1234u);
                EXPECT_EQ(last().sent.type, (start & ~kEhole) | (c.ehole ? kEhole : 0))
                    << std::hex << "type_low " << c.type_low << " start " << start;
            }
        }
    }
}

// A failed fetch ends the call (one call of each shape): no write, records
// not filled, errno kept.
TEST_F(MacKernel, FetchFailureChangesNothing) {
    using Call = int (*)(tavrel_mac_label_t *, tavrel_mac_t *);
    for (Call call : {+[](tavrel_mac_label_t *r, tavrel_mac_t *) { return tavrel_fchmac(kFd, r); },
                      +[](tavrel_mac_label_t *r, tavrel_mac_t *) { return tavrel_statmac(kPath, r); },
                      +[](tavrel_mac_label_t *, tavrel_mac_t *p) { return tavrel_setmac(kPid, p); },
                      +[](tavrel_mac_label_t *, tavrel_mac_t *p) { return tavrel_getmac(kPid, p); },
                      +[](tavrel_mac_label_t *, tavrel_mac_t *) { return tavrel_chmac_ign(kPath); }}) {
        svc = {};
        svc.errs = {ENOENT};
        tavrel_mac_label_t rec{63, {1, 2}};
        tavrel_mac_t prec{1, 2};
        errno = 0;
        EXPECT_EQ(call(&rec, &prec), -1);
        EXPECT_EQ(errno, ENOENT);
        EXPECT_EQ(svc.ncalls, 1u);
        EXPECT_EQ(rec.type_low + rec.mac.lev + rec.mac.cat + prec.lev + prec.cat, 63u + 1 + 2 + 1 + 2);
    }
    svc = {};
    svc.open_err = EACCES;
    errno = 0;
    EXPECT_EQ(mac_get_file(kPath), nullptr);
    EXPECT_EQ(errno, EACCES);
    EXPECT_EQ(mac_get_fd(kFd), nullptr);
    EXPECT_EQ(mac_get_pid(kPid), nullptr);
}

// The setters hand on the write's result unchanged; only the _ign forms
// flatten it to -1.
TEST_F(MacKernel, WriteResultComesBackAsIs) {
    tavrel_mac_label_t rec{0, {1, 1}};
    tavrel_mac_t prec{1, 1};
    Mac obj = make(1, 1, 0x10000);
    Mac subj = make(1, 1, 0);
    svc.set_rc = 5;
    EXPECT_EQ(tavrel_chmac(kPath, &rec), 5);
    EXPECT_EQ(tavrel_fchmac(kFd, &rec), 5);
    EXPECT_EQ(tavrel_setmac(kPid, &prec), 5);
    EXPECT_EQ(mac_set_file(kPath, obj.get()), 5);
    EXPECT_EQ(mac_set_fd(kFd, obj.get()), 5);
    EXPECT_EQ(mac_set_pid(kPid, subj.get()), 5);
    EXPECT_EQ(tavrel_chmac_ign(kPath), -1);
    EXPECT_EQ(tavrel_fchmac_ign(kFd), -1);
}

// A value of the wrong class, or a NULL, is refused before any fetch.  A
// file's class must be 0x10000 exactly: 0x30000 has the bit but isn't it.
TEST_F(MacKernel, RefusedCallsNeverReachTheService) {
    Mac subject = make(1, 1, 0), object = make(1, 1, 0x10000), other = make(1, 1, 0x30000);
    const struct { const char *what; int (*call)(const mac_t *); const mac_t *m; } cases[] = {
        {"pid object", [](const mac_t *m) { return mac_set_pid(kPid, m); }, object.get()},
        {"pid 0x30000", [](const mac_t *m) { return mac_set_pid(kPid, m); }, other.get()},
        {"pid NULL", [](const mac_t *m) { return mac_set_pid(kPid, m); }, nullptr},
        {"file subject", [](const mac_t *m) { return mac_set_file(kPath, m); }, subject.get()},
        {"file 0x30000", [](const mac_t *m) { return mac_set_file(kPath, m); }, other.get()},
        {"file NULL value", [](const mac_t *m) { return mac_set_file(kPath, m); }, nullptr},
        {"file NULL path", [](const mac_t *m) { return mac_set_file(nullptr, m); }, object.get()},
        {"fd subject", [](const mac_t *m) { return mac_set_fd(kFd, m); }, subject.get()},
        {"fd 0x30000", [](const mac_t *m) { return mac_set_fd(kFd, m); }, other.get()},
        {"fd NULL", [](const mac_t *m) { return mac_set_fd(kFd, m); }, nullptr},
        {"get_file NULL", [](const mac_t *) { return mac_get_file(nullptr) ? 0 : -1; }, nullptr},
    };
    for (const auto &c : cases) {
        errno = 0;
        EXPECT_EQ(c.call(c.m), -1) << c.what;
        EXPECT_EQ(errno, EINVAL) << c.what;
        EXPECT_EQ(svc.ncalls, 0u) << c.what;
    }
}

// Every call fetches a label first; when memory runs out anywhere, nothing
// is written and nothing is left behind.
TEST_F(MacKernel, AllocationFailure) {
    using Call = int (*)();
    // One call of each shape; the path and descriptor forms share their code.
    for (Call call : {+[] { tavrel_mac_label_t r{63, {2, 2}}; return tavrel_chmac(kPath, &r); },
                      +[] { tavrel_mac_label_t r{}; return tavrel_fstatmac(kFd, &r); },
                      +[] { tavrel_mac_t r{2, 2}; return tavrel_setmac(kPid, &r); },
                      +[] { tavrel_mac_t r{}; return tavrel_getmac(kPid, &r); },
                      +[] { return tavrel_fchmac_ign(kFd); },
                      +[] { mac_t m{0x3f, 2, 2, 0x1003f}; return mac_set_file(kPath, &m); },
                      +[] { mac_t m{0, 2, 2, 0}; return mac_set_pid(kPid, &m); },
                      +[] { Mac m{mac_get_fd(kFd)}; return m ? 0 : -1; },
                      +[] { Mac m{mac_get_pid(kPid)}; return m ? 0 : -1; }}) {
        vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
            svc = {};
            const int rc = inj.run(call);
            EXPECT_EQ(rc, inj.fired() ? -1 : 0);
            EXPECT_FALSE(inj.fired() && svc.ncalls > 0 && !is_get(last().cmd));  // writes come last
        });
    }
}

}  // namespace
