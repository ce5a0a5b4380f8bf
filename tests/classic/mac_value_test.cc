// The classic value: type word rules, accessors, dominance, permission and
// the flat form.

#include <vyr/classic.h>

#include "contract/tavrel_aux.h"
#include "support/failalloc.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>
#include <memory>

namespace {

struct MacDeleter {
    void operator()(mac_t *m) const { mac_free(m); }
};
using Mac = std::unique_ptr<mac_t, MacDeleter>;

Mac make(unsigned lev, uint64_t cat, uint32_t type) {
    Mac m{mac_init(type)};
    EXPECT_NE(m, nullptr);
    if (m) {
        m->lev = static_cast<uint8_t>(lev);
        m->cat = cat;
    }
    return m;
}

TEST(MacValue, InitTakesAnyTypeAndMirrorsLowByte) {
    for (uint32_t type : {0x0u, 0x10000u, 0x10012u, 0x12u, 0xabcdef01u}) {
        Mac m{mac_init(type)};
        ASSERT_NE(m, nullptr);
        EXPECT_EQ(m->lev, 0);
        EXPECT_EQ(m->cat, 0u);
        EXPECT_EQ(m->type, type);
        EXPECT_EQ(m->type_low, type & 0xffu);
    }
}

TEST(MacValue, ValidLooksAtObjectBitOnly) {
    struct Case {
        uint32_t type;
        int result;
    } cases[] = {
        {0x0, 0}, {0x10000, 0}, {0x10001, 0}, {0x20000, 0}, {0x100, 0}, {0x10012, 0},
        {0x1, -1}, {0x20001, -1}, {0x12, -1}, {0x40080, -1},
    };
    for (const Case &c : cases) {
        Mac m{mac_init(c.type)};
        errno = 0;
        EXPECT_EQ(mac_valid(m.get()), c.result) << std::hex << c.type;
        EXPECT_EQ(errno, c.result ? EINVAL : 0) << std::hex << c.type;
    }
    errno = 0;
    EXPECT_EQ(mac_valid(nullptr), -1);
    EXPECT_EQ(errno, EINVAL);
}

TEST(MacValue, SetTypeRefusesWaiversOnSubjectClass) {
    struct Case {
        uint32_t type;
        bool accepted;
    } cases[] = {{0x1, false}, {0x100001, false}, {0xff, false}, {0x20001, true}, {0x100, true}, {0x1003f, true}, {0, true}};
    for (const Case &c : cases) {
        Mac m = make(3, 5, 0x10000);
        errno = 0;
        int rc = mac_set_type(m.get(), c.type);
        if (c.accepted) {
            EXPECT_EQ(rc, 0) << std::hex << c.type;
            EXPECT_EQ(m->type, c.type);
            EXPECT_EQ(m->type_low, c.type & 0xffu);
        } else {
            EXPECT_EQ(rc, -1) << std::hex << c.type;
            EXPECT_EQ(errno, EINVAL);
            EXPECT_EQ(m->type, 0x10000u);
            EXPECT_EQ(m->type_low, 0u);
        }
        EXPECT_EQ(m->lev, 3);
        EXPECT_EQ(m->cat, 5u);
    }
}

TEST(MacValue, AccessorsAcceptNullWithoutErrno) {
    errno = 1234;
    EXPECT_EQ(mac_get_lev(nullptr), 0);
    EXPECT_EQ(mac_get_cat(nullptr), 0u);
    EXPECT_EQ(mac_get_type(nullptr), 0u);
    EXPECT_EQ(mac_set_lev(nullptr, 1), -1);
    EXPECT_EQ(mac_set_cat(nullptr, 1), -1);
    EXPECT_EQ(mac_set_type(nullptr, 0), -1);
    EXPECT_EQ(errno, 1234);
    EXPECT_EQ(mac_dup(nullptr), nullptr);
    mac_free(nullptr);
}

TEST(MacValue, SettersStoreFieldWidths) {
    Mac m = make(0, 0, 0);
    EXPECT_EQ(mac_set_lev(m.get(), 0x1ff), 0);
    EXPECT_EQ(mac_get_lev(m.get()), 0xff);
    EXPECT_EQ(mac_set_cat(m.get(), ~0ull), 0);
    EXPECT_EQ(mac_get_cat(m.get()), ~0ull);
    EXPECT_EQ(mac_set_type(m.get(), 0x7fff0000u), 0);
    EXPECT_EQ(mac_get_type(m.get()), 0x7fff0000u);
}

TEST(MacValue, DupIsIndependentAndCarriesTypeLow) {
    Mac src = make(9, 0xf0, 0x1002d);
    src->type_low = 0x77;  // out of step on purpose: dup copies, never derives
    Mac copy{mac_dup(src.get())};
    ASSERT_NE(copy, nullptr);
    EXPECT_EQ(std::memcmp(copy.get(), src.get(), sizeof(mac_t)), 0);
    copy->lev = 1;
    EXPECT_EQ(src->lev, 9);
}

TEST(MacValue, CopyMovesTypeOnlyWithinOneClass) {
    struct Case {
        uint32_t dst_type, src_type, expect_type;
    } cases[] = {
        {0x0, 0x10012, 0x0},            // object into subject: subject stays
        {0x10000, 0x0, 0x10000},        // subject into object: object stays
        {0x10000, 0x1003f, 0x1003f},    // object to object
        {0x20000, 0x20005, 0x20005},    // any equal class counts
        {0x20000, 0x10005, 0x20000},
        {0x0, 0x12, 0x0},               // a subject made with waivers: refused, still 0
    };
    for (const Case &c : cases) {
        Mac dst = make(1, 1, c.dst_type);
        Mac src = make(7, 0x55, c.src_type);
        EXPECT_EQ(mac_copy(dst.get(), src.get()), 0);
        EXPECT_EQ(dst->lev, 7);
        EXPECT_EQ(dst->cat, 0x55u);
        EXPECT_EQ(dst->type, c.expect_type) << std::hex << c.dst_type << " <- " << c.src_type;
        EXPECT_EQ(dst->type_low, c.expect_type & 0xffu);
    }
    Mac m = make(0, 0, 0);
    errno = 0;
    EXPECT_EQ(mac_copy(m.get(), nullptr), -1);
    EXPECT_EQ(errno, EINVAL);
    errno = 0;
    EXPECT_EQ(mac_copy(nullptr, m.get()), -1);
    EXPECT_EQ(errno, EINVAL);
}

// The dominance table: each row a pair of levels, each column how the masks
// relate.
TEST(MacValue, CmpTable) {
    struct Case {
        unsigned alev;
        uint64_t acat;
        unsigned blev;
        uint64_t bcat;
        int result;
    } cases[] = {
        // equal levels
        {1, 3, 1, 3, 0}, {1, 1, 1, 3, -1}, {1, 3, 1, 1, 1}, {1, 1, 1, 2, -2},
        // a below b
        {0, 3, 1, 3, -1}, {0, 1, 1, 3, -1}, {0, 3, 1, 1, -2}, {0, 1, 1, 2, -2},
        // a above b; levels are unsigned
        {200, 3, 100, 3, 1}, {200, 1, 100, 3, -2}, {200, 3, 100, 1, 1}, {200, 1, 100, 2, -2},
        {0, 0, 0, 0, 0}, {255, ~0ull, 0, 0, 1},
    };
    for (const Case &c : cases) {
        for (uint32_t type : {0x0u, 0x10000u, 0x1003fu}) {
            Mac a = make(c.alev, c.acat, type);
            Mac b = make(c.blev, c.bcat, type);
            EXPECT_EQ(mac_cmp(a.get(), b.get()), c.result)
                << c.alev << "/" << c.acat << " vs " << c.blev << "/" << c.bcat;
        }
    }
}

TEST(MacValue, CmpLooksAtWaiverByteOnly) {
    struct Case {
        uint32_t a, b;
        int result;
    } cases[] = {{0x0, 0x10000, 0}, {0x100, 0x200, 0}, {0x10001, 0x10002, -2}, {0x10040, 0x10000, -2}};
    for (const Case &c : cases) {
        Mac a = make(4, 4, c.a);
        Mac b = make(4, 4, c.b);
        errno = 0;
        EXPECT_EQ(mac_cmp(a.get(), b.get()), c.result) << std::hex << c.a << " " << c.b;
        EXPECT_EQ(errno, 0);
    }
    Mac m = make(0, 0, 0);
    EXPECT_EQ(mac_cmp(nullptr, nullptr), 0);
    EXPECT_EQ(mac_cmp(m.get(), nullptr), -2);
    EXPECT_EQ(mac_cmp(nullptr, m.get()), -2);
}

// Each waiver bit lifts exactly one test: request it, fail only that test,
// and see that the bit (and only that bit) turns the denial into a grant.
TEST(MacValue, PermitEachWaiverLiftsItsOwnTest) {
    struct Case {
        const char *what;
        uint32_t request;
        unsigned slev;
        uint64_t scat;
        unsigned olev;
        uint64_t ocat;
        uint32_t waiver;
    } cases[] = {
        {"read level", 4, 1, 3, 2, 1, 0x08},
        {"read cat", 4, 2, 1, 2, 3, 0x01},
        {"write level above", 2, 3, 1, 2, 1, 0x10},
        {"write level below", 2, 1, 1, 2, 1, 0x10},
        {"write cat superset", 2, 2, 3, 2, 1, 0x02},
        {"write cat subset", 2, 2, 1, 2, 3, 0x02},
        {"exec level", 1, 1, 3, 2, 1, 0x20},
        {"exec cat", 1, 2, 1, 2, 3, 0x04},
    };
    const uint32_t all_waivers[] = {0x01, 0x02, 0x04, 0x08, 0x10, 0x20, 0x40, 0x80};
    for (const Case &c : cases) {
        Mac s = make(c.slev, c.scat, 0);
        for (uint32_t w : all_waivers) {
            Mac o = make(c.olev, c.ocat, 0x10000 | w);
            int expect = w == c.waiver ? 0 : -1;
            EXPECT_EQ(mac_permit(s.get(), o.get(), c.request), expect) << c.what << " waiver " << std::hex << w;
            EXPECT_EQ(mac_file_permit(s.get(), o.get(), c.request), expect) << c.what;
        }
    }
}

TEST(MacValue, PermitWithoutWaivers) {
    struct Case {
        unsigned slev;
        uint64_t scat;
        unsigned olev;
        uint64_t ocat;
        uint32_t request;
        int result;
    } cases[] = {
        {2, 3, 2, 3, 7, 0},   {200, 3, 100, 1, 4, 0}, {200, 3, 100, 1, 1, 0}, {200, 3, 100, 1, 2, -1},
        {100, 3, 200, 1, 4, -1}, {5, 1, 1, 3, 4, -1}, {5, 0, 1, 0, 5, 0},    {0, 0, 9, 9, 8, 0},
        {0, 0, 9, 9, 0, 0},   {0, 0, 9, 9, ~7u, 0},
    };
    for (const Case &c : cases) {
        Mac s = make(c.slev, c.scat, 0);
        Mac o = make(c.olev, c.ocat, 0x10000);
        EXPECT_EQ(mac_permit(s.get(), o.get(), c.request), c.result)
            << c.slev << "/" << c.scat << " -> " << c.olev << "/" << c.ocat << " req " << c.request;
    }
}

TEST(MacValue, PermitNamedObjects) {
    Mac low_subject = make(0, 0, 0);
    Mac high_subject = make(255, ~0ull, 0);
    Mac equ = make(9, 0xff, MAC_TYPE_EQU);
    Mac low = make(9, 0xff, MAC_TYPE_LOW);
    for (const Mac *s : {&low_subject, &high_subject}) {
        for (uint32_t req = 0; req < 8; ++req) EXPECT_EQ(mac_permit(s->get(), equ.get(), req), 0);
        EXPECT_EQ(mac_permit(s->get(), low.get(), 4 | 1), 0);
        EXPECT_EQ(mac_permit(s->get(), low.get(), 2), -1);
    }
    Mac same = make(9, 0xff, 0);
    EXPECT_EQ(mac_permit(same.get(), low.get(), 7), 0);
}

TEST(MacValue, PermitNullIsEinval) {
    Mac m = make(0, 0, 0);
    for (auto fn : {mac_permit, mac_file_permit}) {
        errno = 0;
        EXPECT_EQ(fn(nullptr, nullptr, 0), -1);
        EXPECT_EQ(errno, EINVAL);
        errno = 0;
        EXPECT_EQ(fn(m.get(), nullptr, 0), -1);
        EXPECT_EQ(errno, EINVAL);
        errno = 0;
        EXPECT_EQ(fn(nullptr, m.get(), 0), -1);
        EXPECT_EQ(errno, EINVAL);
    }
}

TEST(MacValue, EmptyIgnoresClassBits) {
    EXPECT_EQ(mac_empty(nullptr), 0);
    EXPECT_EQ(mac_empty(make(0, 0, 0x10000).get()), 0);
    EXPECT_EQ(mac_empty(make(0, 0, 0x7fff0000).get()), 0);
    EXPECT_EQ(mac_empty(make(0, 0, 0x10001).get()), -1);
    EXPECT_EQ(mac_empty(make(1, 0, 0).get()), -1);
    EXPECT_EQ(mac_empty(make(0, 1, 0).get()), -1);
}

TEST(MacValue, SizeIsConstant) {
    EXPECT_EQ(mac_size(make(5, 5, 0x1003f).get()), 24);
    errno = 0;
    EXPECT_EQ(mac_size(nullptr), -1);
    EXPECT_EQ(errno, EINVAL);
}

TEST(MacValue, FlatFormLayout) {
    Mac m = make(0xa5, 0x0102030405060708ull, 0x1003f);
    unsigned char buf[32];
    std::memset(buf, 0xee, sizeof buf);
    ASSERT_EQ(mac_copy_ext(buf, m.get(), 24), 24);
    EXPECT_EQ(zenk_get_w16(buf + 0), 0x100);
    EXPECT_EQ(zenk_get_w32(buf + 4), 0x1003fu);
    EXPECT_EQ(zenk_get_w8(buf + 8), 0xa5);
    EXPECT_EQ(zenk_get_w64(buf + 16), 0x0102030405060708ull);
    // Bytes the form leaves out are not touched.
    for (size_t i : {2u, 3u, 9u, 10u, 15u, 24u, 31u}) EXPECT_EQ(buf[i], 0xee) << i;
}

TEST(MacValue, FlatFormRoundTripIgnoresGaps) {
    Mac m = make(200, 0xdeadbeefcafef00dull, 0x2ff12);  // even a value mac_valid refuses
    unsigned char buf[24];
    ASSERT_EQ(mac_copy_ext(buf, m.get(), sizeof buf), 24);
    for (size_t i : {2u, 3u, 9u, 10u, 11u, 12u, 13u, 14u, 15u}) buf[i] = static_cast<unsigned char>(i * 37);
    Mac back{mac_copy_int(buf)};
    ASSERT_NE(back, nullptr);
    EXPECT_EQ(back->lev, 200);
    EXPECT_EQ(back->cat, 0xdeadbeefcafef00dull);
    EXPECT_EQ(back->type, 0x2ff12u);
    EXPECT_EQ(back->type_low, 0x12u);
}

TEST(MacValue, FlatFormFailures) {
    Mac m = make(1, 1, 0);
    unsigned char buf[24];
    std::memset(buf, 0x11, sizeof buf);
    errno = 0;
    EXPECT_EQ(mac_copy_ext(buf, m.get(), 23), -1);
    EXPECT_EQ(errno, ERANGE);
    for (unsigned char b : buf) EXPECT_EQ(b, 0x11);
    errno = 0;
    EXPECT_EQ(mac_copy_ext(nullptr, m.get(), 24), -1);
    EXPECT_EQ(errno, EINVAL);

    // A NULL value writes an all-zero form.
    ASSERT_EQ(mac_copy_ext(buf, nullptr, 24), 24);
    Mac zero{mac_copy_int(buf)};
    ASSERT_NE(zero, nullptr);
    EXPECT_EQ(zero->lev, 0);
    EXPECT_EQ(zero->cat, 0u);
    EXPECT_EQ(zero->type, 0u);

    zenk_set_w16(buf, 0x101);
    errno = 0;
    EXPECT_EQ(mac_copy_int(buf), nullptr);
    EXPECT_EQ(errno, EINVAL);
}

TEST(MacValue, AllocationFailureLeavesNothing) {
    Mac src = make(3, 3, 0x10000);
    unsigned char flat[24];
    ASSERT_EQ(mac_copy_ext(flat, src.get(), sizeof flat), 24);
    using Maker = mac_t *(*)(const mac_t *, const unsigned char *);
    const Maker makers[] = {
        [](const mac_t *, const unsigned char *) { return mac_init(0x10000); },
        [](const mac_t *s, const unsigned char *) { return mac_dup(s); },
        [](const mac_t *, const unsigned char *f) { return mac_copy_int(f); },
    };
    for (Maker make_one : makers) {
        vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
            mac_t *m = inj.run([&] { return make_one(src.get(), flat); });
            if (inj.fired()) {
                EXPECT_EQ(m, nullptr);
                EXPECT_EQ(errno, ENOMEM);
                return;
            }
            ASSERT_NE(m, nullptr);
            EXPECT_EQ(m->type, 0x10000u);
            mac_free(m);
        });
    }
}

}  // namespace
