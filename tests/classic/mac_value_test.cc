// The classic value: type word rules, accessors, dominance, permission and the flat form.

#include "classic_test_util.h"
#include "contract/tavrel_aux.h"
#include "support/failalloc.h"

#include <cerrno>
#include <cstring>
#include <tuple>

using namespace classic_test;

namespace {

// mac_valid makes an object of bit 0x10000 alone, while mac_set_type refuses
// waivers only on the subject class: the two disagree on 0x20001.  mac_init
// takes every word untested and mirrors its low byte.
TEST(MacValue, TypeWordRules) {
    const struct { uint32_t type; int valid; bool settable; } cases[] = {
        {0x0, 0, true},     {0x10000, 0, true}, {0x10001, 0, true}, {0x20000, 0, true},    {0x100, 0, true},
        {0x30001, 0, true}, {0x1, -1, false},   {0x12, -1, false},  {0x100001, -1, false}, {0x20001, -1, true},
    };
    for (const auto &c : cases) {
        Mac m{mac_init(c.type)}, o = make(3, 5, 0x10000);
        errno = 0;
        EXPECT_EQ(mac_valid(m.get()), c.valid) << std::hex << c.type;
        EXPECT_EQ(errno, c.valid ? EINVAL : 0);
        const mac_t want{c.type & 0xffu, 0, 0, c.type};
        EXPECT_EQ(str(m.get()), str(&want));
        EXPECT_EQ(mac_set_type(o.get(), c.type), c.settable ? 0 : -1);
        EXPECT_EQ(str(o.get()), str(make(3, 5, c.settable ? c.type : 0x10000).get()));  // refused: unchanged
    }
    expect_fail([] { return mac_valid(nullptr); }, EINVAL);
}

// The accessors take NULL quietly, without errno, unlike the other calls.
TEST(MacValue, AccessorsAndDup) {
    errno = 1234;
    EXPECT_EQ(mac_get_lev(nullptr) + mac_get_cat(nullptr) + mac_get_type(nullptr), 0u);
    EXPECT_EQ(mac_set_lev(nullptr, 1) + mac_set_cat(nullptr, 1) + mac_set_type(nullptr, 0), -3);
    EXPECT_EQ(errno, 1234);
    EXPECT_EQ(mac_dup(nullptr), nullptr);
    Mac m = make(0, 0, 0x10000);
    EXPECT_EQ(mac_set_lev(m.get(), 0x1ff) + mac_set_cat(m.get(), ~0ull), 0);
    m->type_low = 0x77;  // out of step on purpose: a copy carries it, never derives it
    EXPECT_EQ(str(Mac{mac_dup(m.get())}.get()), "255 ffffffffffffffff 10000 low 77");
}

// Level and mask always move; the type only between values of one class.
TEST(MacValue, CopyMovesTypeOnlyWithinOneClass) {
    const struct { uint32_t dst, src, want; } cases[] = {
        {0x0, 0x10012, 0x0}, {0x10000, 0x0, 0x10000}, {0x10000, 0x1003f, 0x1003f}, {0x20000, 0x20005, 0x20005},
        {0x0, 0x12, 0x0},  // a subject made with waivers: the setter refuses
    };
    for (const auto &c : cases) {
        Mac dst = make(1, 1, c.dst);
        EXPECT_EQ(mac_copy(dst.get(), make(7, 0x55, c.src).get()), 0);
        EXPECT_EQ(str(dst.get()), str(make(7, 0x55, c.want).get())) << std::hex << c.dst << " <- " << c.src;
    }
    Mac m = make(0, 0, 0);
    expect_fail([&] { return mac_copy(m.get(), nullptr); }, EINVAL);
    expect_fail([&] { return mac_copy(nullptr, m.get()); }, EINVAL);
}

// The dominance table (rows: levels; columns: how the masks relate), then the
// type words, of which only the low bytes must agree.
TEST(MacValue, Cmp) {
    const struct { unsigned alev; uint64_t acat; unsigned blev; uint64_t bcat; int result; uint32_t atype = 0, btype = 0; } cases[] = {
        {1, 3, 1, 3, 0},     {1, 1, 1, 3, -1},     {1, 3, 1, 1, 1},     {1, 1, 1, 2, -2},
        {0, 3, 1, 3, -1},    {0, 1, 1, 3, -1},     {0, 3, 1, 1, -2},    {0, 1, 1, 2, -2},
        {200, 3, 100, 3, 1}, {200, 1, 100, 3, -2}, {200, 3, 100, 1, 1}, {200, 1, 100, 2, -2},
        {4, 4, 4, 4, 0, 0x0, 0x10000}, {4, 4, 4, 4, 0, 0x100, 0x200}, {4, 4, 4, 4, -2, 0x10001, 0x10002},
        {4, 4, 4, 4, -2, 0x10040, 0x10000},  // the whole low byte counts, not only the six waivers
    };
    for (const auto &c : cases) {
        Mac a = make(c.alev, c.acat, c.atype), b = make(c.blev, c.bcat, c.btype);
        EXPECT_EQ(mac_cmp(a.get(), b.get()), c.result) << str(a.get()) << " vs " << str(b.get());
    }
    Mac m = make(0, 0, 0);
    EXPECT_EQ(mac_cmp(nullptr, nullptr) * 4 + mac_cmp(m.get(), nullptr) + mac_cmp(nullptr, m.get()), -4);
}

// Each waiver bit lifts exactly one test: fail only that test, and see that
// this bit, and no other, turns the denial into a grant.
TEST(MacValue, PermitEachWaiverLiftsItsOwnTest) {
    const struct { const char *what; uint32_t request; unsigned slev; uint64_t scat; unsigned olev; uint64_t ocat; uint32_t waiver; } cases[] = {
        {"read level", 4, 1, 3, 2, 1, 0x08},         {"read cat", 4, 2, 1, 2, 3, 0x01},
        {"write level above", 2, 3, 1, 2, 1, 0x10},  {"write level below", 2, 1, 1, 2, 1, 0x10},
        {"write cat superset", 2, 2, 3, 2, 1, 0x02}, {"write cat subset", 2, 2, 1, 2, 3, 0x02},
        {"exec level", 1, 1, 3, 2, 1, 0x20},         {"exec cat", 1, 2, 1, 2, 3, 0x04},
    };
    for (const auto &c : cases)
        for (uint32_t w = 1; w <= 0x80; w <<= 1)
            EXPECT_EQ(mac_permit(make(c.slev, c.scat, 0).get(), make(c.olev, c.ocat, 0x10000 | w).get(), c.request),
                      w == c.waiver ? 0 : -1) << c.what << " waiver " << std::hex << w;
}

// Decisions that need no waiver, and the named objects; both names decide alike.
TEST(MacValue, PermitTable) {
    const struct { unsigned slev; uint64_t scat; unsigned olev; uint64_t ocat; uint32_t otype, request; int result; } cases[] = {
        {2, 3, 2, 3, 0x10000, 7, 0},
        {200, 3, 100, 1, 0x10000, 4 | 1, 0},  // dominating is enough to read and execute
        {200, 3, 100, 1, 0x10000, 2, -1},     // writing needs equality
        {0, 0, 9, 9, 0x10000, ~7u, 0},        // bits other than 4, 2, 1 ask nothing
        {0, 0, 9, 0xff, MAC_TYPE_EQU, 7, 0},  {0, 0, 9, 0xff, MAC_TYPE_LOW, 4 | 1, 0},
        {255, ~0ull, 9, 0xff, MAC_TYPE_LOW, 2, -1},
    };
    for (const auto &c : cases) {
        Mac s = make(c.slev, c.scat, 0), o = make(c.olev, c.ocat, c.otype);
        EXPECT_EQ(mac_permit(s.get(), o.get(), c.request), c.result) << str(s.get()) << " -> " << str(o.get());
        EXPECT_EQ(mac_file_permit(s.get(), o.get(), c.request), c.result);
    }
    Mac m = make(0, 0, 0);
    for (auto fn : {mac_permit, mac_file_permit}) {
        expect_fail([&] { return fn(m.get(), nullptr, 0); }, EINVAL);
        expect_fail([&] { return fn(nullptr, m.get(), 0); }, EINVAL);
    }
}

TEST(MacValue, EmptyAndSize) {
    EXPECT_EQ(mac_empty(nullptr), 0);
    EXPECT_EQ(mac_empty(make(0, 0, 0x7fff0000).get()), 0);  // class bits don't count
    for (auto [lev, cat, type] : {std::tuple{0u, 0ull, 0x10001u}, {1u, 0ull, 0u}, {0u, 1ull, 0u}})
        EXPECT_EQ(mac_empty(make(lev, cat, type).get()), -1) << lev << " " << cat << " " << type;
    EXPECT_EQ(mac_size(make(5, 5, 0x1003f).get()), 24);
    expect_fail([] { return mac_size(nullptr); }, EINVAL);
}

// The flat form's offsets, the bytes it leaves alone, and the way back, which
// neither looks at those bytes nor tests the type.
TEST(MacValue, FlatForm) {
    Mac m = make(0xa5, 0x0102030405060708ull, 0x2ff12);
    unsigned char buf[32];
    std::memset(buf, 0xee, sizeof buf);
    ASSERT_EQ(mac_copy_ext(buf, m.get(), 24), 24);
    EXPECT_EQ(zenk_get_w16(buf + 0), 0x100);
    EXPECT_EQ(zenk_get_w32(buf + 4), 0x2ff12u);
    EXPECT_EQ(zenk_get_w8(buf + 8), 0xa5);
    EXPECT_EQ(zenk_get_w64(buf + 16), 0x0102030405060708ull);
    for (size_t i : {2u, 3u, 9u, 15u, 24u, 31u}) EXPECT_EQ(buf[i], 0xee) << i;
    for (size_t i : {2u, 3u, 9u, 12u, 15u}) buf[i] = static_cast<unsigned char>(i * 37);
    EXPECT_EQ(str(Mac{mac_copy_int(buf)}.get()), str(m.get()));
    ASSERT_EQ(mac_copy_ext(buf, nullptr, 24), 24);  // a NULL value writes zeros
    EXPECT_EQ(str(Mac{mac_copy_int(buf)}.get()), "0 0 0");
    std::memset(buf, 0x11, sizeof buf);
    expect_fail([&] { return mac_copy_ext(buf, m.get(), 23); }, ERANGE);
    EXPECT_EQ(buf[0] + buf[8] + buf[23], 3 * 0x11);  // nothing written
    expect_fail([&] { return mac_copy_ext(nullptr, m.get(), 24); }, EINVAL);
    errno = 0;
    EXPECT_EQ(mac_copy_int(buf), nullptr);  // the magic word is wrong
    EXPECT_EQ(errno, EINVAL);
}

TEST(MacValue, AllocationFailure) {
    Mac src = make(3, 3, 0x10000);
    unsigned char flat[24];
    ASSERT_EQ(mac_copy_ext(flat, src.get(), sizeof flat), 24);
    for (auto make_one : {+[](const mac_t *, const unsigned char *) { return mac_init(0x10000); },
                          +[](const mac_t *s, const unsigned char *) { return mac_dup(s); },
                          +[](const mac_t *, const unsigned char *f) { return mac_copy_int(f); }}) {
        vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
            Mac m{inj.run([&] { return make_one(src.get(), flat); })};
            EXPECT_EQ(m == nullptr, inj.fired());
            EXPECT_TRUE(!inj.fired() || errno == ENOMEM);
        });
    }
}

}  // namespace
