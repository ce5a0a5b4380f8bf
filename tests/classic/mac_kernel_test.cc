// The classic kernel calls against the scripted label service: what they
// send, what survives, and which calls never reach the service.

#include "classic_test_util.h"
#include "kdouble.h"
#include "support/failalloc.h"

#include <vyr/kernel.h>
#include <vyr/label.h>

#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>

using namespace classic_test;

namespace {

// Text calls consult the level database: give them one with no back-end.
class Env : public ::testing::Environment {
    void SetUp() override { use_db_config("kernel", "# no back-ends configured\n"); }
};
const auto *const g_env = ::testing::AddGlobalTestEnvironment(new Env);

constexpr const char *kPath = "/srv/data";
constexpr int kFd = 7;
constexpr int kPid = 4242;

constexpr uint16_t kCcnr = VYR_TYPE_CCNR, kCcnri = VYR_TYPE_CCNRI, kEhole = VYR_TYPE_EHOLE;

// A label with everything the classic calls can't express.
kdouble::Label rich_label(uint16_t type) {
    return kdouble::make_label(5, 3, 0xf0f0, type, {1, 2, 3, 4, 5}, {{900, 7, 1}, {10, 0, 3}}, {{44, 1, 2}});
}

void expect_same_rest(const kdouble::Label &got, const kdouble::Label &want) {
    EXPECT_EQ(got.ilev, want.ilev);
    ASSERT_EQ(got.blob_size, want.blob_size);
    EXPECT_EQ(std::memcmp(got.blob, want.blob, want.blob_size), 0);
    ASSERT_EQ(got.nroles1, want.nroles1);
    ASSERT_EQ(got.nroles2, want.nroles2);
    for (uint32_t i = 0; i < want.nroles1; ++i) {
        EXPECT_EQ(got.roles1[i].id, want.roles1[i].id);
        EXPECT_EQ(got.roles1[i].attr, want.roles1[i].attr);
        EXPECT_EQ(got.roles1[i].rights, want.roles1[i].rights);
    }
    for (uint32_t i = 0; i < want.nroles2; ++i) EXPECT_EQ(got.roles2[i].id, want.roles2[i].id);
}

class MacKernel : public ::testing::Test {
protected:
    void SetUp() override { kdouble::reset(); }

    // The last command sent, which for a setter must be its write.
    const kdouble::Call &last() const { return kdouble::call(kdouble::call_count() - 1); }

    void expect_untouched_service() const {
        EXPECT_EQ(kdouble::call_count(), 0u);
        EXPECT_EQ(kdouble::open_count(), 0);
    }
};

uint64_t word(const char *p) { return reinterpret_cast<uintptr_t>(p); }
uint64_t word(int n) { return static_cast<uint64_t>(static_cast<int64_t>(n)); }

// The six waivers reach the kernel as one flag: all of them or nothing.
TEST_F(MacKernel, ChmacWaiverRuleAndSurvivors) {
    struct Case {
        uint32_t type_low;
        bool ehole;
    } cases[] = {{63, true}, {0x7f, true}, {0xff, true}, {0xbf, true}, {0x2d, false},
                 {0x12, false}, {0, false}, {0x40, false}, {0x3e, false}};
    for (uint16_t start : {uint16_t(kCcnr), uint16_t(kCcnr | kEhole), uint16_t(kCcnri | kEhole | 0x100)}) {
        for (const Case &c : cases) {
            for (bool by_fd : {false, true}) {
                kdouble::reset();
                kdouble::Label before = rich_label(start);
                kdouble::set_label(before);
                tavrel_mac_label_t rec{c.type_low, {9, 0x1234}};
                int rc = by_fd ? tavrel_fchmac(kFd, &rec) : tavrel_chmac(kPath, &rec);
                ASSERT_EQ(rc, 0);
                const kdouble::Call &set = last();
                EXPECT_EQ(set.cmd, by_fd ? VYR_CMD_SET_FD : VYR_CMD_SET_PATH);
                EXPECT_EQ(set.target, by_fd ? word(kFd) : word(kPath));
                EXPECT_EQ(kdouble::call(0).cmd, by_fd ? VYR_CMD_GET_FD : VYR_CMD_GET_PATH);
                EXPECT_EQ(set.sent.lev, 9);
                EXPECT_EQ(set.sent.cat, 0x1234u);
                uint16_t want = static_cast<uint16_t>((start & ~kEhole) | (c.ehole ? kEhole : 0));
                EXPECT_EQ(set.sent.type, want) << std::hex << "type_low " << c.type_low << " start " << start;
                expect_same_rest(set.sent, before);
            }
        }
    }
}

TEST_F(MacKernel, StatmacReportsEholeAsAllWaivers) {
    struct Case {
        uint16_t type;
        uint32_t type_low;
    } cases[] = {{0, 0}, {kEhole, 63}, {kCcnr | kCcnri, 0}, {0xffff, 63}};
    for (const Case &c : cases) {
        for (bool by_fd : {false, true}) {
            kdouble::reset();
            kdouble::set_label(rich_label(c.type));
            tavrel_mac_label_t rec{0xdead, {0, 0}};
            ASSERT_EQ(by_fd ? tavrel_fstatmac(kFd, &rec) : tavrel_statmac(kPath, &rec), 0);
            EXPECT_EQ(rec.type_low, c.type_low);
            EXPECT_EQ(rec.mac.lev, 5);
            EXPECT_EQ(rec.mac.cat, 0xf0f0u);
            for (size_t i = 0; i < kdouble::call_count(); ++i)
                EXPECT_EQ(kdouble::call(i).cmd, by_fd ? VYR_CMD_GET_FD : VYR_CMD_GET_PATH);
        }
    }
}

TEST_F(MacKernel, PartialWaiversDoNotSurviveTheKernel) {
    tavrel_mac_label_t rec{0x2d, {1, 1}};
    ASSERT_EQ(tavrel_chmac(kPath, &rec), 0);
    tavrel_mac_label_t back{};
    ASSERT_EQ(tavrel_statmac(kPath, &back), 0);
    EXPECT_EQ(back.type_low, 0u);

    ASSERT_EQ(tavrel_chmac_ign(kPath), 0);
    ASSERT_EQ(tavrel_statmac(kPath, &back), 0);
    EXPECT_EQ(back.type_low, 63u);
    EXPECT_EQ(back.mac.lev, 0);
    EXPECT_EQ(back.mac.cat, 0u);
}

TEST_F(MacKernel, ProcessCallsLeaveTypeAlone) {
    kdouble::Label before = rich_label(kEhole | kCcnr);
    kdouble::set_label(before);
    tavrel_mac_t rec{17, 0x77};
    ASSERT_EQ(tavrel_setmac(kPid, &rec), 0);
    EXPECT_EQ(kdouble::call(0).cmd, VYR_CMD_GET_PID);
    EXPECT_EQ(last().cmd, VYR_CMD_SET_PID);
    EXPECT_EQ(last().target, word(kPid));
    EXPECT_EQ(last().sent.lev, 17);
    EXPECT_EQ(last().sent.cat, 0x77u);
    EXPECT_EQ(last().sent.type, kEhole | kCcnr);
    expect_same_rest(last().sent, before);

    tavrel_mac_t got{};
    ASSERT_EQ(tavrel_getmac(kPid, &got), 0);
    EXPECT_EQ(got.lev, 17);
    EXPECT_EQ(got.cat, 0x77u);

    Mac m{mac_get_pid(kPid)};
    ASSERT_NE(m, nullptr);
    EXPECT_EQ(m->type, 0u);
    EXPECT_EQ(m->lev, 17);
    EXPECT_EQ(m->cat, 0x77u);
}

TEST_F(MacKernel, FetchFailureChangesNothing) {
    kdouble::set_label(rich_label(0));
    tavrel_mac_label_t rec{63, {1, 2}};
    tavrel_mac_t prec{1, 2};
    using Call = int (*)(tavrel_mac_label_t *, tavrel_mac_t *);
    const Call calls[] = {
        [](tavrel_mac_label_t *r, tavrel_mac_t *) { return tavrel_chmac(kPath, r); },
        [](tavrel_mac_label_t *r, tavrel_mac_t *) { return tavrel_fchmac(kFd, r); },
        [](tavrel_mac_label_t *r, tavrel_mac_t *) { return tavrel_statmac(kPath, r); },
        [](tavrel_mac_label_t *r, tavrel_mac_t *) { return tavrel_fstatmac(kFd, r); },
        [](tavrel_mac_label_t *, tavrel_mac_t *p) { return tavrel_setmac(kPid, p); },
        [](tavrel_mac_label_t *, tavrel_mac_t *p) { return tavrel_getmac(kPid, p); },
        [](tavrel_mac_label_t *, tavrel_mac_t *) { return tavrel_chmac_ign(kPath); },
    };
    for (Call call : calls) {
        kdouble::reset();
        kdouble::fail_commands({ENOENT});
        errno = 0;
        EXPECT_EQ(call(&rec, &prec), -1);
        EXPECT_EQ(errno, ENOENT);
        EXPECT_EQ(kdouble::call_count(), 1u);  // the failed get, no write
        EXPECT_EQ(rec.type_low, 63u);
        EXPECT_EQ(rec.mac.lev, 1);
        EXPECT_EQ(prec.cat, 2u);
    }
    kdouble::reset();
    kdouble::fail_open(EACCES);
    errno = 0;
    EXPECT_EQ(mac_get_file(kPath), nullptr);
    EXPECT_EQ(errno, EACCES);
    EXPECT_EQ(mac_get_fd(kFd), nullptr);
    EXPECT_EQ(mac_get_pid(kPid), nullptr);
}

TEST_F(MacKernel, WriteResultComesBackAsIs) {
    tavrel_mac_label_t rec{0, {1, 1}};
    tavrel_mac_t prec{1, 1};
    for (int rc : {-1, 5}) {
        kdouble::reset();
        kdouble::set_result(rc);
        EXPECT_EQ(tavrel_chmac(kPath, &rec), rc);
        EXPECT_EQ(tavrel_fchmac(kFd, &rec), rc);
        EXPECT_EQ(tavrel_setmac(kPid, &prec), rc);
        Mac obj = make(1, 1, 0x10000);
        Mac subj = make(1, 1, 0);
        EXPECT_EQ(mac_set_file(kPath, obj.get()), rc);
        EXPECT_EQ(mac_set_fd(kFd, obj.get()), rc);
        EXPECT_EQ(mac_set_pid(kPid, subj.get()), rc);
        // Only the _ign forms flatten it.
        EXPECT_EQ(tavrel_chmac_ign(kPath), -1);
        EXPECT_EQ(tavrel_fchmac_ign(kFd), -1);
    }
}

TEST_F(MacKernel, RefusedCallsNeverReachTheService) {
    Mac subject = make(1, 1, 0);
    Mac object = make(1, 1, 0x10000);
    Mac other = make(1, 1, 0x20000);
    Mac wide = make(1, 1, 0x30000);
    struct Case {
        const char *what;
        int (*call)(const mac_t *);
        const mac_t *m;
    } cases[] = {
        {"pid object", [](const mac_t *m) { return mac_set_pid(kPid, m); }, object.get()},
        {"pid 0x20000", [](const mac_t *m) { return mac_set_pid(kPid, m); }, other.get()},
        {"pid NULL", [](const mac_t *m) { return mac_set_pid(kPid, m); }, nullptr},
        {"file subject", [](const mac_t *m) { return mac_set_file(kPath, m); }, subject.get()},
        {"file 0x20000", [](const mac_t *m) { return mac_set_file(kPath, m); }, other.get()},
        {"file 0x30000", [](const mac_t *m) { return mac_set_file(kPath, m); }, wide.get()},
        {"file NULL value", [](const mac_t *m) { return mac_set_file(kPath, m); }, nullptr},
        {"file NULL path", [](const mac_t *m) { return mac_set_file(nullptr, m); }, object.get()},
        {"fd subject", [](const mac_t *m) { return mac_set_fd(kFd, m); }, subject.get()},
        {"fd 0x20000", [](const mac_t *m) { return mac_set_fd(kFd, m); }, other.get()},
        {"fd NULL", [](const mac_t *m) { return mac_set_fd(kFd, m); }, nullptr},
    };
    for (const Case &c : cases) {
        kdouble::reset();
        errno = 0;
        EXPECT_EQ(c.call(c.m), -1) << c.what;
        EXPECT_EQ(errno, EINVAL) << c.what;
        expect_untouched_service();
    }
    kdouble::reset();
    errno = 0;
    EXPECT_EQ(mac_get_file(nullptr), nullptr);
    EXPECT_EQ(errno, EINVAL);
    expect_untouched_service();
}

TEST_F(MacKernel, FileValuesThroughTheKernel) {
    struct Case {
        uint32_t set, got;
    } cases[] = {{0x1003f, 0x1003f}, {0x1002d, 0x10000}, {0x10000, 0x10000}, {0x100ff, 0x1003f}, {0x7f01003f, 0x1003f}};
    for (const Case &c : cases) {
        for (bool by_fd : {false, true}) {
            kdouble::reset();
            Mac m = make(3, 0x300, c.set);
            ASSERT_EQ(by_fd ? mac_set_fd(kFd, m.get()) : mac_set_file(kPath, m.get()), 0);
            Mac back{by_fd ? mac_get_fd(kFd) : mac_get_file(kPath)};
            ASSERT_NE(back, nullptr);
            EXPECT_EQ(back->type, c.got) << std::hex << c.set;
            EXPECT_EQ(back->type_low, c.got & 0xffu);
            EXPECT_EQ(back->lev, 3);
            EXPECT_EQ(back->cat, 0x300u);
        }
    }
}

TEST_F(MacKernel, ConversionsCallNoKernel) {
    tavrel_mac_label_t rec{63, {4, 0x44}};
    Mac equ{tavrel_mac_label_t_to_mac_t(&rec)};
    EXPECT_EQ(equ->type, 0x1003fu);
    EXPECT_EQ(equ->lev, 4);
    EXPECT_EQ(equ->cat, 0x44u);
    rec.type_low = 0;
    EXPECT_EQ(Mac{tavrel_mac_label_t_to_mac_t(&rec)}->type, 0x10000u);

    tavrel_mac_t prec{6, 0x66};
    Mac subject{tavrel_mac_t_to_mac_t(&prec, 0)};
    Mac object{tavrel_mac_t_to_mac_t(&prec, 0x10000)};
    Mac odd{tavrel_mac_t_to_mac_t(&prec, 0x12)};  // not tested
    EXPECT_EQ(subject->type, 0u);
    EXPECT_EQ(object->type, 0x10000u);
    EXPECT_EQ(odd->type, 0x12u);
    EXPECT_EQ(object->lev, 6);
    EXPECT_EQ(object->cat, 0x66u);

    tavrel_mac_label_t out{};
    mac_t_to_tavrel_mac_label_t(equ.get(), &out);
    EXPECT_EQ(out.type_low, 0x3fu);  // class bits don't pass
    EXPECT_EQ(out.mac.lev, 4);
    mac_t_to_tavrel_mac_label_t(nullptr, &out);
    EXPECT_EQ(out.type_low, 0u);
    EXPECT_EQ(out.mac.lev, 0);
    EXPECT_EQ(out.mac.cat, 0u);
    tavrel_mac_t pout{1, 1};
    mac_t_to_tavrel_mac_t(object.get(), &pout);
    EXPECT_EQ(pout.lev, 6);
    EXPECT_EQ(pout.cat, 0x66u);
    mac_t_to_tavrel_mac_t(nullptr, &pout);
    EXPECT_EQ(pout.lev, 0);
    EXPECT_EQ(pout.cat, 0u);
    expect_untouched_service();
}

TEST_F(MacKernel, TextConversions) {
    tavrel_mac_t prec{6, 0xa0};
    Text t{tavrel_mac_t_to_text(&prec, 0x1002d, 0)};
    EXPECT_STREQ(t.get(), "6:a0:1002d");
    t.reset(tavrel_mac_t_to_text(&prec, 0x12, 0));  // invalid value: no text
    EXPECT_EQ(t, nullptr);
    tavrel_mac_label_t rec{0x12, {6, 0xa0}};
    t.reset(tavrel_mac_label_t_to_text(&rec, 0));
    EXPECT_STREQ(t.get(), "6:a0:10012");

    tavrel_mac_t pin{9, 9};
    EXPECT_EQ(tavrel_mac_t_from_text(&pin, nullptr), 0);  // nothing read: zeros
    EXPECT_EQ(pin.lev, 0);
    EXPECT_EQ(pin.cat, 0u);
    EXPECT_EQ(tavrel_mac_t_from_text(&pin, "12:ff"), 0);
    EXPECT_EQ(pin.lev, 12);
    EXPECT_EQ(pin.cat, 0xffu);
    errno = 0;
    EXPECT_EQ(tavrel_mac_t_from_text(&pin, "300:1"), -1);
    EXPECT_EQ(errno, EINVAL);
    EXPECT_EQ(pin.lev, 12);
    EXPECT_EQ(pin.cat, 0xffu);

    tavrel_mac_label_t lin{7, {7, 7}};
    EXPECT_EQ(tavrel_mac_label_t_from_text(&lin, nullptr), 0);
    EXPECT_EQ(lin.type_low, 0u);
    EXPECT_EQ(lin.mac.lev, 0);
    EXPECT_EQ(lin.mac.cat, 0u);
    EXPECT_EQ(tavrel_mac_label_t_from_text(&lin, "3:4:7f01002d"), 0);
    EXPECT_EQ(lin.type_low, 0x2du);
    EXPECT_EQ(lin.mac.lev, 3);
    EXPECT_EQ(lin.mac.cat, 4u);
    EXPECT_EQ(tavrel_mac_label_t_from_text(&lin, "3:4:zz"), -1);
    EXPECT_EQ(lin.type_low, 0x2du);
    expect_untouched_service();
}

bool is_set(int cmd) {
    return cmd == VYR_CMD_SET_PATH || cmd == VYR_CMD_SET_FD || cmd == VYR_CMD_SET_PID;
}

// Every call fetches a label first; when that runs out of memory, nothing is
// written and nothing is left behind.
TEST_F(MacKernel, AllocationFailureInKernelCalls) {
    const kdouble::Label start = rich_label(kCcnr);
    using Call = int (*)();
    const Call calls[] = {
        [] { tavrel_mac_label_t r{63, {2, 2}}; return tavrel_chmac(kPath, &r); },
        [] { tavrel_mac_label_t r{63, {2, 2}}; return tavrel_fchmac(kFd, &r); },
        [] { tavrel_mac_label_t r{}; return tavrel_statmac(kPath, &r); },
        [] { tavrel_mac_label_t r{}; return tavrel_fstatmac(kFd, &r); },
        [] { tavrel_mac_t r{2, 2}; return tavrel_setmac(kPid, &r); },
        [] { tavrel_mac_t r{}; return tavrel_getmac(kPid, &r); },
        [] { return tavrel_chmac_ign(kPath); },
        [] { return tavrel_fchmac_ign(kFd); },
        [] { mac_t m{0x3f, 2, 2, 0x1003f}; return mac_set_file(kPath, &m); },
        [] { mac_t m{0x3f, 2, 2, 0x1003f}; return mac_set_fd(kFd, &m); },
        [] { mac_t m{0, 2, 2, 0}; return mac_set_pid(kPid, &m); },
    };
    for (Call call : calls) {
        vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
            kdouble::reset();
            kdouble::set_label(start);
            int rc = inj.run(call);
            bool wrote = false;
            for (size_t i = 0; i < kdouble::call_count(); ++i) wrote |= is_set(kdouble::call(i).cmd);
            if (inj.fired()) {
                EXPECT_EQ(rc, -1);
                EXPECT_FALSE(wrote);
                EXPECT_EQ(kdouble::label().lev, start.lev);
                return;
            }
            EXPECT_EQ(rc, 0);
        });
    }
    using Getter = mac_t *(*)();
    const Getter getters[] = {[] { return mac_get_file(kPath); }, [] { return mac_get_fd(kFd); },
                              [] { return mac_get_pid(kPid); }};
    for (Getter get : getters) {
        vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
            kdouble::reset();
            kdouble::set_label(start);
            mac_t *m = inj.run(get);
            if (inj.fired()) {
                EXPECT_EQ(m, nullptr);
                return;
            }
            ASSERT_NE(m, nullptr);
            EXPECT_EQ(m->lev, start.lev);
            mac_free(m);
        });
    }
}

TEST_F(MacKernel, AllocationFailureInTextConversions) {
    start_databases();
    vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
        tavrel_mac_label_t rec{1, {1, 1}};
        int rc = inj.run([&] { return tavrel_mac_label_t_from_text(&rec, "5:5:equ"); });
        if (inj.fired()) {
            EXPECT_EQ(rc, -1);
            EXPECT_EQ(rec.type_low, 1u);
            EXPECT_EQ(rec.mac.lev, 1);
            return;
        }
        EXPECT_EQ(rc, 0);
        EXPECT_EQ(rec.type_low, 0x3fu);
    });
    vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
        tavrel_mac_t rec{5, 5};
        int rc = inj.run([&] { return tavrel_mac_t_from_text(&rec, "6:6"); });
        if (inj.fired()) {
            EXPECT_EQ(rc, -1);
            EXPECT_EQ(rec.lev, 5);
            return;
        }
        EXPECT_EQ(rc, 0);
        EXPECT_EQ(rec.lev, 6);
    });
    using ToText = char *(*)();
    const ToText writers[] = {
        [] { tavrel_mac_t r{5, 5}; return tavrel_mac_t_to_text(&r, 0x1003f, 0); },
        [] { tavrel_mac_label_t r{0x3f, {5, 5}}; return tavrel_mac_label_t_to_text(&r, 0); },
    };
    for (ToText write : writers) {
        vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
            char *t = inj.run(write);
            if (inj.fired()) {
                EXPECT_EQ(t, nullptr);
                return;
            }
            EXPECT_STREQ(t, "5:5:1003f");
            std::free(t);
        });
    }
}

}  // namespace
