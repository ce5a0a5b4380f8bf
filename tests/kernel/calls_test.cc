// Kernel label calls against the scripted service (double/kdouble.h): the
// commands and target words sent, the E2BIG retry loop and its buffers, and
// what each failure leaves behind.

#include <vyr/kernel.h>
#include <vyr/label.h>

#include "contract/tavrel_base.h"
#include "kdouble.h"
#include "support/failalloc.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <functional>
#include <string>

namespace {

using kdouble::make_label;

// Room of an offered buffer: exactly what was asked under AddressSanitizer,
// which reports requested sizes; rounded up by at most a chunk otherwise.
void expect_room(std::size_t room, std::size_t asked) {
    if (asked == 0) {
        EXPECT_EQ(room, 0u);
        return;
    }
#if defined(__SANITIZE_ADDRESS__)
    EXPECT_EQ(room, asked);
#else
    EXPECT_GE(room, asked);
    EXPECT_LT(room, asked + 32);
#endif
}

uint64_t word_of(const void *p) { return static_cast<uint64_t>(reinterpret_cast<uintptr_t>(p)); }

void expect_label(const vyrl_t *l, const kdouble::Label &want) {
    ASSERT_NE(l, nullptr);
    const vyrml_t *ml = l->ml;
    const vyrrl_t *rl = l->rl;
    EXPECT_EQ(ml->lev, want.lev);
    EXPECT_EQ(ml->ilev, want.ilev);
    EXPECT_EQ(ml->cat, want.cat);
    EXPECT_EQ(ml->type, want.type);
    ASSERT_EQ(ml->blob_size, want.blob_size);
    if (want.blob_size == 0) {
        EXPECT_EQ(ml->blob, nullptr);
    } else {
        EXPECT_EQ(std::memcmp(ml->blob, want.blob, want.blob_size), 0);
    }
    ASSERT_EQ(rl->nroles1, want.nroles1);
    ASSERT_EQ(rl->nroles2, want.nroles2);
    for (uint32_t i = 0; i < want.nroles1; ++i) EXPECT_EQ(vyr_role_cmp(&rl->roles1[i], &want.roles1[i]), 1) << i;
    for (uint32_t i = 0; i < want.nroles2; ++i) EXPECT_EQ(vyr_role_cmp(&rl->roles2[i], &want.roles2[i]), 1) << i;
    if (want.nroles1 == 0) {
        EXPECT_EQ(rl->roles1, nullptr);
    }
    if (want.nroles2 == 0) {
        EXPECT_EQ(rl->roles2, nullptr);
    }
}

kdouble::Label blob_and_roles(std::size_t blob_len, uint32_t n1, uint32_t n2, uint8_t seed = 0) {
    kdouble::Label l = make_label(4, 2, 0xf00f, 3);
    l.blob_size = static_cast<uint32_t>(blob_len);
    for (std::size_t i = 0; i < blob_len; ++i) l.blob[i] = static_cast<uint8_t>(seed + i);
    l.nroles1 = n1;
    l.nroles2 = n2;
    for (uint32_t i = 0; i < n1; ++i) l.roles1[i] = vyr_role_t{1000u - i + seed, i, static_cast<uint8_t>(i | 0x80)};
    for (uint32_t i = 0; i < n2; ++i) l.roles2[i] = vyr_role_t{500u - i + seed, ~i, static_cast<uint8_t>(i)};
    return l;
}

class KernelCalls : public ::testing::Test {
protected:
    void SetUp() override { kdouble::reset(); }
};

TEST_F(KernelCalls, SmallLabelTakesOneEmptyPass) {
    kdouble::set_label(make_label(5, 2, 0x30, 4));
    const char *path = "/some/file";
    vyrl_t *l = vyr_get_path(path);
    ASSERT_NE(l, nullptr);
    expect_label(l, kdouble::label());
    EXPECT_EQ(vyrl_ucnt(l), 1);
    EXPECT_EQ(vyrml_ucnt(l->ml), 1);
    EXPECT_EQ(vyrrl_ucnt(l->rl), 1);

    ASSERT_EQ(kdouble::call_count(), 1u);
    const kdouble::Call &c = kdouble::call(0);
    EXPECT_EQ(c.cmd, 24);
    EXPECT_EQ(c.target, word_of(path));
    EXPECT_EQ(c.label, l);  // filled in place, not copied
    EXPECT_EQ(c.blob_size, 0u);
    EXPECT_EQ(c.nroles1, 0u);
    EXPECT_EQ(c.nroles2, 0u);
    EXPECT_EQ(c.blob_room + c.roles1_room + c.roles2_room, 0u);
    EXPECT_EQ(kdouble::open_count(), 1);
    vyrl_put(l);
}

// Every call sends its own command number and its target word as the
// service sees it: the path's address, or the number widened with its sign.
TEST_F(KernelCalls, CommandsAndTargetWords) {
    static const char kPath[] = "/p";
    struct Case {
        const char *name;
        std::function<void(vyrl_t *)> call;
        int cmd;
        uint64_t target;
    };
    const Case cases[] = {
        {"get_path", [](vyrl_t *) { vyrl_put(vyr_get_path(kPath)); }, 24, word_of(kPath)},
        {"get_lpath", [](vyrl_t *) { vyrl_put(vyr_get_lpath(kPath)); }, 33, word_of(kPath)},
        {"get_path NULL", [](vyrl_t *) { vyrl_put(vyr_get_path(nullptr)); }, 24, 0},
        {"get_fd", [](vyrl_t *) { vyrl_put(vyr_get_fd(7)); }, 23, 7},
        {"get_fd -1", [](vyrl_t *) { vyrl_put(vyr_get_fd(-1)); }, 23, ~uint64_t{0}},
        {"get_pid", [](vyrl_t *) { vyrl_put(vyr_get_pid(4321)); }, 20, 4321},
        {"get_pid -2", [](vyrl_t *) { vyrl_put(vyr_get_pid(-2)); }, 20, ~uint64_t{0} - 1},
        {"get_pid INT_MIN", [](vyrl_t *) { vyrl_put(vyr_get_pid(INT32_MIN)); }, 20, 0xffffffff80000000u},
        {"set_path", [](vyrl_t *l) { EXPECT_EQ(vyr_set_path(kPath, l), 0); }, 22, word_of(kPath)},
        {"set_lpath", [](vyrl_t *l) { EXPECT_EQ(vyr_set_lpath(kPath, l), 0); }, 32, word_of(kPath)},
        {"set_fd", [](vyrl_t *l) { EXPECT_EQ(vyr_set_fd(12, l), 0); }, 21, 12},
        {"set_fd -1", [](vyrl_t *l) { EXPECT_EQ(vyr_set_fd(-1, l), 0); }, 21, ~uint64_t{0}},
        {"set_pid", [](vyrl_t *l) { EXPECT_EQ(vyr_set_pid(99, l), 0); }, 19, 99},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        kdouble::reset();
        vyrl_t *mine = vyrl_get_new_init_mac(1, 1, 1, 1);
        ASSERT_NE(mine, nullptr);
        c.call(mine);
        ASSERT_EQ(kdouble::call_count(), 1u);
        EXPECT_EQ(kdouble::call(0).cmd, c.cmd);
        EXPECT_EQ(kdouble::call(0).target, c.target);
        EXPECT_EQ(kdouble::open_count(), 1);
        vyrl_put(mine);
    }
}

TEST_F(KernelCalls, RolesOnlyGrowsJustTheFirstList) {
    kdouble::set_label(make_label(1, 0, 0, 0, {}, {{9, 1, 3}, {4, 2, 1}}));
    vyrl_t *l = vyr_get_fd(3);
    expect_label(l, kdouble::label());
    ASSERT_EQ(kdouble::call_count(), 2u);
    const kdouble::Call &second = kdouble::call(1);
    EXPECT_EQ(second.nroles1, 2u);
    EXPECT_EQ(second.blob_size, 0u);
    EXPECT_EQ(second.nroles2, 0u);
    expect_room(second.roles1_room, 32);
    expect_room(second.blob_room, 0);
    expect_room(second.roles2_room, 0);
    vyrl_put(l);
}

TEST_F(KernelCalls, BlobAndRolesTakeTwoPassesWithExactBuffers) {
    kdouble::set_label(blob_and_roles(64, 10, 6));
    vyrl_t *l = vyr_get_path("/x");
    expect_label(l, kdouble::label());
    ASSERT_EQ(kdouble::call_count(), 2u);
    EXPECT_EQ(kdouble::call(0).blob_size, 0u);
    const kdouble::Call &second = kdouble::call(1);
    EXPECT_EQ(second.cmd, 24);
    EXPECT_EQ(second.label, l);
    EXPECT_EQ(second.blob_size, 64u);
    EXPECT_EQ(second.nroles1, 10u);
    EXPECT_EQ(second.nroles2, 6u);
    expect_room(second.blob_room, 64);
    expect_room(second.roles1_room, 160);
    expect_room(second.roles2_room, 96);
    EXPECT_EQ(kdouble::open_count(), 2);  // the channel is opened before every pass
    vyrl_put(l);
}

// A label that grows twice between passes costs a pass each time, each pass
// offers exactly the latest sizes, and no buffer of an earlier pass is lost.
TEST_F(KernelCalls, LabelGrowingBetweenPasses) {
    const kdouble::Label first = blob_and_roles(4, 1, 0);
    const kdouble::Label second = blob_and_roles(10, 3, 2, 7);
    const kdouble::Label third = blob_and_roles(11, 5, 2, 9);
    vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
        kdouble::reset();
        kdouble::set_label(first);
        kdouble::grow_after_e2big({second, third});
        errno = 0;
        vyrl_t *l = inj.run([] { return vyr_get_lpath("/grow"); });
        if (inj.fired()) {
            EXPECT_EQ(l, nullptr);
            EXPECT_EQ(errno, ENOMEM);
            return;
        }
        expect_label(l, third);
        ASSERT_EQ(kdouble::call_count(), 4u);
        const kdouble::Label *offered[] = {&first, &second, &third};
        for (std::size_t pass = 1; pass < 4; ++pass) {
            SCOPED_TRACE(pass);
            const kdouble::Call &c = kdouble::call(pass);
            const kdouble::Label &want = *offered[pass - 1];
            EXPECT_EQ(c.cmd, 33);
            EXPECT_EQ(c.blob_size, want.blob_size);
            EXPECT_EQ(c.nroles1, want.nroles1);
            EXPECT_EQ(c.nroles2, want.nroles2);
            expect_room(c.blob_room, want.blob_size);
            expect_room(c.roles1_room, 16u * want.nroles1);
            expect_room(c.roles2_room, 16u * want.nroles2);
        }
        vyrl_put(l);
    });
}

// The loop has no limit of its own: it goes on for as long as the service
// says E2BIG, even when the sizes don't change.
TEST_F(KernelCalls, RetriesForAsLongAsTheServiceSaysE2big) {
    kdouble::set_label(blob_and_roles(8, 2, 1));
    kdouble::fail_commands({E2BIG, E2BIG, E2BIG, E2BIG, E2BIG, E2BIG, E2BIG, E2BIG, E2BIG, E2BIG, E2BIG, E2BIG,
                            E2BIG, E2BIG, E2BIG, E2BIG, E2BIG, E2BIG, E2BIG, E2BIG, E2BIG, E2BIG, E2BIG, E2BIG,
                            E2BIG, E2BIG, E2BIG, E2BIG, E2BIG, E2BIG, E2BIG, E2BIG, E2BIG, E2BIG, E2BIG, E2BIG,
                            E2BIG, E2BIG, E2BIG, E2BIG});
    vyr_test::FailAlloc::reset();
    vyr_test::Injector inj(0);
    vyrl_t *l = inj.run([] { return vyr_get_pid(77); });
    expect_label(l, kdouble::label());
    EXPECT_EQ(kdouble::call_count(), 42u);  // 40 scripted E2BIG, one real, one fill
    EXPECT_EQ(kdouble::open_count(), 42);
    vyrl_put(l);
    EXPECT_EQ(vyr_test::FailAlloc::live(), 0u);
    vyr_test::FailAlloc::reset();
}

TEST_F(KernelCalls, FailedOpen) {
    EXPECT_EQ(vyr_init(), 0);
    kdouble::fail_open(EACCES);
    EXPECT_EQ(vyr_init(), 1);  // 1, not -1

    errno = 0;
    EXPECT_EQ(vyr_get_path("/x"), nullptr);
    EXPECT_EQ(errno, EACCES);

    vyrl_t *l = vyrl_get_new_init_mac(3, 3, 3, 3);
    ASSERT_NE(l, nullptr);
    errno = 0;
    EXPECT_EQ(vyr_set_path("/x", l), -1);
    EXPECT_EQ(errno, EACCES);
    errno = 0;
    EXPECT_EQ(vyr_set_pid(1, l), -1);
    EXPECT_EQ(errno, EACCES);
    EXPECT_EQ(vyr_set_sys_max_fd(0), -1);
    EXPECT_EQ(kdouble::call_count(), 0u);  // no command went out
    vyrl_put(l);
}

TEST_F(KernelCalls, ReleaseClosesAndTheNextCallReopens) {
    EXPECT_EQ(vyr_release(), 0);
    EXPECT_EQ(kdouble::close_count(), 1);
    vyrl_t *l = vyr_get_fd(1);
    ASSERT_NE(l, nullptr);
    EXPECT_EQ(kdouble::open_count(), 1);
    vyrl_put(l);
}

// A getter whose command fails with anything but E2BIG, in the first or a
// later pass, returns NULL with that errno and leaves nothing allocated: the
// buffers of the passes before are released with the label.
TEST_F(KernelCalls, CommandFailureInAnyPassLeavesNothing) {
    struct Case {
        const char *name;
        std::initializer_list<int> errs;
        int want_errno;
        std::size_t calls;
    };
    const Case cases[] = {
        {"first pass", {ENOENT}, ENOENT, 1},
        {"after a real E2BIG", {0, EACCES}, EACCES, 2},
        {"after a real and a scripted E2BIG", {0, E2BIG, EIO}, EIO, 3},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        kdouble::reset();
        kdouble::set_label(blob_and_roles(16, 2, 2));
        kdouble::fail_commands(c.errs);
        vyr_test::FailAlloc::reset();
        vyr_test::Injector inj(0);
        errno = 0;
        vyrl_t *l = inj.run([] { return vyr_get_path("/f"); });
        EXPECT_EQ(l, nullptr);
        EXPECT_EQ(errno, c.want_errno);
        EXPECT_EQ(kdouble::call_count(), c.calls);
        EXPECT_EQ(vyr_test::FailAlloc::live(), 0u);
    }
    vyr_test::FailAlloc::reset();
}

TEST_F(KernelCalls, AllocationFailureInTheRetryLoop) {
    kdouble::set_label(blob_and_roles(64, 16, 16));
    const long attempts = vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
        errno = 0;
        vyrl_t *l = inj.run([] { return vyr_get_fd(5); });
        if (inj.fired()) {
            EXPECT_EQ(l, nullptr);
            EXPECT_EQ(errno, ENOMEM);
            return;
        }
        expect_label(l, kdouble::label());
        vyrl_put(l);
    });
    // Three records, then blob, roles1 and roles2: six allocations to fail.
    EXPECT_EQ(attempts, 7);
}

// A setter sends the caller's label as it stands, returns the command's own
// result, and leaves the label and its use counts as they were.
TEST_F(KernelCalls, SetterSendsTheLabelAndLeavesItAlone) {
    const vyr_role_t r1[] = {{30, 1, 7}, {20, 2, 6}};
    const vyr_role_t r2[] = {{5, 3, 0xff}};
    vyrl_t *l = vyrl_get_new_init_mac_roles(6, 1, 0x8000000000000001u, 0xbeef, r1, 2, r2, 1);
    ASSERT_NE(l, nullptr);
    vyrl_t *before = vyrl_dup(l);
    ASSERT_NE(before, nullptr);

    for (int rc : {0, -1, 5}) {
        SCOPED_TRACE(rc);
        kdouble::reset();
        kdouble::set_result(rc);
        EXPECT_EQ(vyr_set_lpath("/t", l), rc);
        ASSERT_EQ(kdouble::call_count(), 1u);
        const kdouble::Call &c = kdouble::call(0);
        EXPECT_EQ(c.label, l);
        const kdouble::Label &sent = c.sent;
        EXPECT_EQ(sent.lev, 6);
        EXPECT_EQ(sent.ilev, 1);
        EXPECT_EQ(sent.cat, 0x8000000000000001u);
        EXPECT_EQ(sent.type, 0xbeef);
        EXPECT_EQ(sent.nroles1, 2u);
        EXPECT_EQ(sent.nroles2, 1u);
        EXPECT_EQ(vyrl_cmp(l, before, 0), 1);
        EXPECT_EQ(vyrl_ucnt(l), 1);
        EXPECT_EQ(vyrml_ucnt(l->ml), 1);
        EXPECT_EQ(vyrrl_ucnt(l->rl), 1);
    }
    vyrl_put(before);
    vyrl_put(l);
}

// The system maximum operations read "/" by path, change the type word (and
// for the ccnr form the integrity level) and write the rest unchanged.
TEST_F(KernelCalls, SystemMaximumLabels) {
    kdouble::Label root = blob_and_roles(5, 2, 1);
    root.lev = 9;
    root.ilev = 3;
    root.cat = 0xf0;
    root.type = 6;
    struct Case {
        const char *name;
        std::function<int()> call;
        int set_cmd;
        uint64_t target;
        uint16_t type;
        uint8_t ilev;
    };
    static const char kTarget[] = "/target";
    const Case cases[] = {
        {"path", [] { return vyr_set_sys_max_path(kTarget); }, 22, word_of(kTarget), 7, 3},
        {"ccnr path", [] { return vyr_set_sys_max_ccnr_path(kTarget); }, 22, word_of(kTarget), 1, 0},
        {"fd", [] { return vyr_set_sys_max_fd(11); }, 21, 11, 7, 3},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        kdouble::reset();
        kdouble::set_label(root);
        vyr_test::FailAlloc::reset();
        vyr_test::Injector inj(0);
        EXPECT_EQ(inj.run(c.call), 0);
        EXPECT_EQ(vyr_test::FailAlloc::live(), 0u);  // the root label was dropped

        ASSERT_EQ(kdouble::call_count(), 3u);  // root: E2BIG, fill; then the set
        for (std::size_t i = 0; i < 2; ++i) {
            EXPECT_EQ(kdouble::call(i).cmd, 24);
            EXPECT_STREQ(reinterpret_cast<const char *>(kdouble::call(i).target), "/");
        }
        const kdouble::Call &set = kdouble::call(2);
        EXPECT_EQ(set.cmd, c.set_cmd);
        EXPECT_EQ(set.target, c.target);
        EXPECT_EQ(set.sent.type, c.type);
        EXPECT_EQ(set.sent.ilev, c.ilev);
        EXPECT_EQ(set.sent.lev, 9);
        EXPECT_EQ(set.sent.cat, 0xf0u);
        ASSERT_EQ(set.sent.blob_size, 5u);
        EXPECT_EQ(std::memcmp(set.sent.blob, root.blob, 5), 0);
        ASSERT_EQ(set.sent.nroles1, 2u);
        ASSERT_EQ(set.sent.nroles2, 1u);
        EXPECT_EQ(vyr_role_cmp(&set.sent.roles1[1], &root.roles1[1]), 1);
        EXPECT_EQ(vyr_role_cmp(&set.sent.roles2[0], &root.roles2[0]), 1);
    }
    vyr_test::FailAlloc::reset();
}

TEST_F(KernelCalls, SystemMaximumPassesTheSetterResultAndFailsWithoutRoot) {
    kdouble::set_result(-1);
    EXPECT_EQ(vyr_set_sys_max_path("/t"), -1);
    EXPECT_EQ(kdouble::call_count(), 2u);

    kdouble::reset();
    kdouble::set_result(3);
    EXPECT_EQ(vyr_set_sys_max_ccnr_path("/t"), 3);

    kdouble::reset();
    kdouble::fail_commands({ENOENT});
    errno = 0;
    EXPECT_EQ(vyr_set_sys_max_fd(4), -1);
    EXPECT_EQ(errno, ENOENT);
    EXPECT_EQ(kdouble::call_count(), 1u);  // no set command after a failed read
}

TEST_F(KernelCalls, SystemMaximumUnderAllocationFailure) {
    kdouble::set_label(blob_and_roles(3, 1, 1));
    vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
        kdouble::reset();
        kdouble::set_label(blob_and_roles(3, 1, 1));
        errno = 0;
        const int rc = inj.run([] { return vyr_set_sys_max_path("/t"); });
        if (inj.fired()) {
            EXPECT_EQ(rc, -1);
            EXPECT_EQ(errno, ENOMEM);
            // Nothing is written when "/" can't be read.
            for (std::size_t i = 0; i < kdouble::call_count(); ++i) EXPECT_EQ(kdouble::call(i).cmd, 24);
            return;
        }
        EXPECT_EQ(rc, 0);
    });
}

}  // namespace
