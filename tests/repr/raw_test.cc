// Raw label forms: exact bytes, sizes, round trips, truncation and version
// handling in every reader, and allocation failure.

#include <vyr/label.h>
#include <vyr/raw.h>

#include "support/failalloc.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <memory>
#include <string>
#include <vector>

namespace {

using Bytes = std::vector<uint8_t>;

// Owns a label, a part or a writer's buffer for the length of a test.
struct LabelPut {
    void operator()(vyrl_t *l) const { vyrl_put(l); }
    void operator()(vyrml_t *m) const { vyrml_put(m); }
    void operator()(vyrrl_t *r) const { vyrrl_put(r); }
};
using LabelPtr = std::unique_ptr<vyrl_t, LabelPut>;
using MlPtr = std::unique_ptr<vyrml_t, LabelPut>;
using RlPtr = std::unique_ptr<vyrrl_t, LabelPut>;

struct Free {
    void operator()(void *p) const { std::free(p); }
};

Bytes take(uint8_t *buf, uint64_t size) {
    std::unique_ptr<uint8_t, Free> owned(buf);
    return buf == nullptr ? Bytes{} : Bytes(buf, buf + size);
}

// An exactly sized heap copy of the first `len` bytes, so that any read at or
// past `len` is a heap overflow that AddressSanitizer reports.
std::unique_ptr<uint8_t[]> exact_copy(const Bytes &b, std::size_t len) {
    auto p = std::make_unique<uint8_t[]>(len);
    if (len != 0) std::memcpy(p.get(), b.data(), len);
    return p;
}

// Role parts are filled by hand so that any order, duplicates included,
// reaches the writer as given.
RlPtr role_part(std::initializer_list<vyr_role_t> r1, std::initializer_list<vyr_role_t> r2) {
    RlPtr rl(vyrrl_get_new_alloc(static_cast<uint32_t>(r1.size()), static_cast<uint32_t>(r2.size())));
    if (!rl) return rl;
    std::copy(r1.begin(), r1.end(), rl->roles1);
    std::copy(r2.begin(), r2.end(), rl->roles2);
    return rl;
}

MlPtr mandatory(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type, const Bytes &blob = {}) {
    MlPtr ml(vyrml_get_new_init(lev, ilev, cat, type));
    if (!ml || blob.empty()) return ml;
    ml->blob = static_cast<unsigned char *>(std::malloc(blob.size()));
    std::memcpy(ml->blob, blob.data(), blob.size());
    ml->blob_size = static_cast<uint32_t>(blob.size());
    return ml;
}

LabelPtr label(MlPtr ml, RlPtr rl) {
    LabelPtr l(vyrl_get_new_init_mr(ml.get(), rl.get()));
    if (l) {
        (void)ml.release();
        (void)rl.release();
    }
    return l;
}

Bytes raw_of(const vyrml_t *ml) {
    uint64_t size = 0;
    uint8_t *buf = vyrml_get_raw(ml, &size);
    return take(buf, size);
}
Bytes raw_of(const vyrrl_t *rl) {
    uint64_t size = 0;
    uint8_t *buf = vyrrl_get_raw(rl, &size);
    return take(buf, size);
}
Bytes raw_of(const vyrl_t *l) {
    uint64_t size = 0;
    uint8_t *buf = vyrl_get_raw(l, &size);
    return take(buf, size);
}

// A label with a bit of everything: blob, both lists, all type and rights
// bits, a non-canonical first list with a duplicate.
LabelPtr rich_label() {
    return label(mandatory(0xfe, 0x7f, 0x8000000000000011u, 0xffff, {0, 1, 2, 0xff, 0x80, 0x41}),
                 role_part({{1, 0xdeadbeef, 0xff}, {9, 0, 0x80}, {9, 1, 1}}, {{0xffffffffffffffffu, 7, 0x55}}));
}

TEST(RawForm, MinimumSizes) {
    EXPECT_EQ(VYRL_RAW_MIN_SIZE, 26u);
    EXPECT_EQ(VYRLM_RAW_MIN_SIZE, 18u);
    EXPECT_EQ(VYRRL_RAW_MIN_SIZE, 11u);
}

TEST(RawForm, WholeLabelWithoutBlobOrRoles) {
    LabelPtr l(vyrl_get_new_init_mac(2, 1, 0x11, 4));
    ASSERT_TRUE(l);
    const Bytes want = {0x01, 0x00, 0x04, 0x00, 0x02, 0x01, 0x11, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00,
                        0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00, 0x00};
    EXPECT_EQ(raw_of(l.get()), want);
    EXPECT_EQ(vyrl_raw_size(l.get()), 26u);
}

TEST(RawForm, MandatoryPartWithBlob) {
    MlPtr ml = mandatory(3, 2, 0xff, 1, {0x41, 0x42, 0x43, 0x44, 0x45});
    ASSERT_TRUE(ml);
    const Bytes want = {0x01, 0x00, 0x01, 0x00, 0x03, 0x02, 0xff, 0x00, 0x00, 0x00, 0x00, 0x00,
                        0x00, 0x00, 0x05, 0x00, 0x00, 0x00, 0x41, 0x42, 0x43, 0x44, 0x45};
    uint64_t size = 0;
    uint8_t *buf = vyrml_get_raw(ml.get(), &size);
    ASSERT_NE(buf, nullptr);
    EXPECT_EQ(size, 23u);
    EXPECT_EQ(Bytes(buf, buf + size), want);
    std::free(buf);  // the start of the form is the start of the allocation
    EXPECT_EQ(vyrml_raw_size(ml.get()), 23u);
}

TEST(RawForm, RoleEntry) {
    const vyr_role_t role = {0x0102030405060708u, 0x0a0b0c0d, 5};
    uint8_t out[14];
    std::memset(out, 0xaa, sizeof out);
    uint8_t *cursor = out;
    vyr_roles_to_raw(&cursor, &role, 1);
    EXPECT_EQ(cursor, out + 13);
    EXPECT_EQ(Bytes(out, out + 14),
              (Bytes{0x08, 0x07, 0x06, 0x05, 0x04, 0x03, 0x02, 0x01, 0x0d, 0x0c, 0x0b, 0x0a, 0x05, 0xaa}));

    vyr_role_t back[2];
    std::memset(back, 0x5a, sizeof back);
    const uint8_t *in = out;
    vyr_roles_from_raw(back, 1, &in);
    EXPECT_EQ(in, out + 13);
    EXPECT_EQ(vyr_role_cmp(&back[0], &role), 1);
    EXPECT_EQ(back[1].id, 0x5a5a5a5a5a5a5a5au);  // nothing past n is touched
}

TEST(RawForm, RoleConversionOfNothingTouchesNothing) {
    uint8_t byte = 0x11;
    uint8_t *out = &byte;
    vyr_roles_to_raw(&out, nullptr, 0);
    EXPECT_EQ(out, &byte);
    const uint8_t *in = &byte;
    vyr_roles_from_raw(nullptr, 0, &in);
    EXPECT_EQ(in, &byte);
    EXPECT_EQ(byte, 0x11);
}

TEST(RawForm, RolePartLayout) {
    RlPtr rl = role_part({{0x10, 1, 1}}, {{0x30, 3, 3}, {0x20, 2, 2}});
    ASSERT_TRUE(rl);
    const Bytes b = raw_of(rl.get());
    ASSERT_EQ(b.size(), 50u);
    EXPECT_EQ(vyrrl_raw_size(rl.get()), 50u);
    EXPECT_EQ(b[0], 0x01);
    EXPECT_EQ(b[1], 0x00);
    EXPECT_EQ(Bytes(b.begin() + 3, b.begin() + 11), (Bytes{1, 0, 0, 0, 2, 0, 0, 0}));
    // Entries follow in list order: roles1, then roles2.
    EXPECT_EQ(b[11], 0x10);
    EXPECT_EQ(b[11 + 13], 0x30);
    EXPECT_EQ(b[11 + 26], 0x20);
    EXPECT_EQ(b[11 + 26 + 12], 2);
}

TEST(RawForm, WholeLabelLayout) {
    LabelPtr l = label(mandatory(1, 0, 0, 0, {0xb0, 0xb1}), role_part({{0x77, 0x12345678, 0x81}}, {}));
    ASSERT_TRUE(l);
    const Bytes b = raw_of(l.get());
    ASSERT_EQ(b.size(), 41u);
    EXPECT_EQ(vyrl_raw_size(l.get()), 41u);
    EXPECT_EQ(Bytes(b.begin() + 14, b.begin() + 26), (Bytes{2, 0, 0, 0, 1, 0, 0, 0, 0, 0, 0, 0}));
    EXPECT_EQ(b[26], 0xb0);
    EXPECT_EQ(b[27], 0xb1);
    EXPECT_EQ(Bytes(b.begin() + 28, b.end()),
              (Bytes{0x77, 0, 0, 0, 0, 0, 0, 0, 0x78, 0x56, 0x34, 0x12, 0x81}));
}

// The size functions of stored forms agree with the writers.
TEST(RawForm, StoredSizesMatchWrittenSizes) {
    LabelPtr l = rich_label();
    ASSERT_TRUE(l);
    const Bytes whole = raw_of(l.get());
    const Bytes ml = raw_of(l->ml);
    const Bytes rl = raw_of(l->rl);
    EXPECT_EQ(vyrrawl_size(whole.data()), whole.size());
    EXPECT_EQ(vyrrawml_size(ml.data()), ml.size());
    EXPECT_EQ(vyrrawrl_size(rl.data()), rl.size());
    EXPECT_EQ(whole.size(), 26u + 6 + 13 * 4);
    EXPECT_EQ(ml.size(), 18u + 6);
    EXPECT_EQ(rl.size(), 11u + 13 * 4);
}

// Every field, all bits of type and rights, stored order and duplicates
// survive each of the three round trips.
TEST(RawForm, RoundTrips) {
    LabelPtr l = rich_label();
    ASSERT_TRUE(l);

    const Bytes whole = raw_of(l.get());
    LabelPtr back(vyrl_get_from_raw(whole.data(), whole.size()));
    ASSERT_TRUE(back);
    EXPECT_EQ(vyrl_cmp(l.get(), back.get(), 0), 1);
    EXPECT_EQ(vyrl_ucnt(back.get()), 1);
    EXPECT_EQ(vyrml_ucnt(back->ml), 1);
    EXPECT_EQ(vyrrl_ucnt(back->rl), 1);
    EXPECT_EQ(back->ml->type, 0xffff);
    EXPECT_EQ(back->rl->roles1[0].rights, 0xff);
    // Stored order, not canonical order: 1 before 9, and the duplicate 9 kept.
    ASSERT_EQ(back->rl->nroles1, 3u);
    EXPECT_EQ(back->rl->roles1[0].id, 1u);
    EXPECT_EQ(back->rl->roles1[1].id, 9u);
    EXPECT_EQ(back->rl->roles1[2].id, 9u);

    const Bytes ml = raw_of(l->ml);
    uint64_t consumed = 0;
    MlPtr ml_back(vyrml_get_from_raw(ml.data(), ml.size(), &consumed));
    ASSERT_TRUE(ml_back);
    EXPECT_EQ(vyrml_cmp(l->ml, ml_back.get()), 1);
    EXPECT_EQ(consumed, 6u + 26);
    EXPECT_NE(ml_back->blob, l->ml->blob);

    const Bytes rl = raw_of(l->rl);
    RlPtr rl_back(vyrrl_get_from_raw(rl.data(), rl.size()));
    ASSERT_TRUE(rl_back);
    EXPECT_EQ(vyrrl_cmp(l->rl, rl_back.get(), 0), 1);
}

TEST(RawForm, EmptyListsAndBlobReadBackAsNull) {
    LabelPtr l(vyrl_get_new_init_mac(7, 7, 7, 7));
    ASSERT_TRUE(l);
    const Bytes whole = raw_of(l.get());
    LabelPtr back(vyrl_get_from_raw(whole.data(), whole.size()));
    ASSERT_TRUE(back);
    EXPECT_EQ(back->ml->blob, nullptr);
    EXPECT_EQ(back->ml->blob_size, 0u);
    EXPECT_EQ(back->rl->roles1, nullptr);
    EXPECT_EQ(back->rl->roles2, nullptr);
    EXPECT_EQ(vyrl_cmp(l.get(), back.get(), 0), 1);

    const Bytes rl = raw_of(l->rl);
    ASSERT_EQ(rl.size(), 11u);
    RlPtr rl_back(vyrrl_get_from_raw(rl.data(), rl.size()));
    ASSERT_TRUE(rl_back);
    EXPECT_EQ(rl_back->nroles1 + rl_back->nroles2, 0u);
    EXPECT_EQ(rl_back->roles1, nullptr);
    EXPECT_EQ(rl_back->roles2, nullptr);
}

// The mandatory-part reader reports the offset of the role entries of a
// whole-label form, which chains into the role-part reader of that form.
TEST(RawForm, ConsumedChainsIntoTheLabelRoleReader) {
    LabelPtr l = label(mandatory(2, 2, 2, 2), role_part({{5, 5, 5}}, {{4, 4, 4}}));
    ASSERT_TRUE(l);
    const Bytes whole = raw_of(l.get());
    uint64_t consumed = 0;
    MlPtr ml(vyrml_get_from_raw(whole.data(), whole.size(), &consumed));
    ASSERT_TRUE(ml);
    EXPECT_EQ(consumed, 26u);
    EXPECT_EQ(vyrml_cmp(ml.get(), l->ml), 1);
    RlPtr rl(vyrrl_get_from_raw_lbl(whole.data(), whole.size(), consumed));
    ASSERT_TRUE(rl);
    EXPECT_EQ(vyrrl_cmp(rl.get(), l->rl, 0), 1);

    const Bytes head18(whole.begin(), whole.begin() + 18);
    MlPtr exact(vyrml_get_from_raw(head18.data(), 18, &consumed));
    ASSERT_TRUE(exact);
    EXPECT_EQ(exact->blob, nullptr);
    EXPECT_EQ(consumed, 26u);
}

// A list with a count but no array: the whole-label writer keeps the count
// and zeroes the room of its entries.
TEST(RawForm, WholeLabelWriterSkipsAMissingList) {
    LabelPtr l = label(mandatory(1, 1, 1, 1), role_part({}, {{3, 3, 3}}));
    ASSERT_TRUE(l);
    l->rl->nroles1 = 2;  // roles1 stays NULL
    const Bytes b = raw_of(l.get());
    ASSERT_EQ(b.size(), 26u + 13 * 3);
    EXPECT_EQ(Bytes(b.begin() + 18, b.begin() + 26), (Bytes{2, 0, 0, 0, 1, 0, 0, 0}));
    EXPECT_EQ(Bytes(b.begin() + 26, b.begin() + 52), Bytes(26, 0));
    EXPECT_EQ(b[52], 3);
    l->rl->nroles1 = 0;
}

// One valid form of each kind and its reader.
struct ReaderCase {
    const char *name;
    Bytes form;
    std::function<bool(const uint8_t *, uint64_t)> read;  // true: got a record
};

std::vector<ReaderCase> reader_cases() {
    LabelPtr l = rich_label();
    LabelPtr one_role = label(mandatory(1, 1, 1, 1), role_part({{1, 1, 1}}, {}));
    if (!l || !one_role) return {};
    auto whole = [](const uint8_t *b, uint64_t n) { return LabelPtr(vyrl_get_from_raw(b, n)) != nullptr; };
    auto ml = [](const uint8_t *b, uint64_t n) {
        uint64_t consumed = 12345;
        MlPtr m(vyrml_get_from_raw(b, n, &consumed));
        if (!m) {
            EXPECT_EQ(consumed, 12345u);  // only a success stores it
        }
        return m != nullptr;
    };
    auto rl = [](const uint8_t *b, uint64_t n) { return RlPtr(vyrrl_get_from_raw(b, n)) != nullptr; };
    auto rl_lbl = [](uint64_t offset) {
        return [offset](const uint8_t *b, uint64_t n) { return RlPtr(vyrrl_get_from_raw_lbl(b, n, offset)) != nullptr; };
    };
    return {
        {"whole", raw_of(l.get()), whole},
        {"whole, one role", raw_of(one_role.get()), whole},
        {"whole, empty", raw_of(VYRL_ZERO), whole},
        {"mandatory", raw_of(l->ml), ml},
        {"mandatory, empty", raw_of(VYRL_ZERO->ml), ml},
        {"roles", raw_of(l->rl), rl},
        {"roles, one", raw_of(one_role->rl), rl},
        {"roles, empty", raw_of(VYRL_ZERO->rl), rl},
        {"roles of whole", raw_of(l.get()), rl_lbl(26 + 6)},
        {"roles of whole, one", raw_of(one_role.get()), rl_lbl(26)},
    };
}

// Every length below a valid form gives NULL, the form's own length and any
// longer one give a record, and no length makes a reader touch a byte past
// it (each attempt reads from an exactly sized heap copy).
TEST(RawForm, EveryTruncationFails) {
    const auto cases = reader_cases();
    ASSERT_EQ(cases.size(), 10u);
    for (const ReaderCase &c : cases) {
        SCOPED_TRACE(c.name);
        ASSERT_FALSE(c.form.empty());
        for (std::size_t len = 0; len < c.form.size(); ++len) {
            auto buf = exact_copy(c.form, len);
            EXPECT_FALSE(c.read(buf.get(), len)) << "len " << len;
        }
        auto full = exact_copy(c.form, c.form.size());
        EXPECT_TRUE(c.read(full.get(), c.form.size()));
        Bytes longer = c.form;
        longer.resize(c.form.size() + 77, 0xee);
        auto extra = exact_copy(longer, longer.size());
        EXPECT_TRUE(c.read(extra.get(), longer.size()));
    }
}

// A blob of 5 stored: 22 bytes are too few, 23 and 100 read the same part.
TEST(RawForm, MandatoryLengthAgainstStoredBlobSize) {
    MlPtr ml = mandatory(3, 2, 0xff, 1, {1, 2, 3, 4, 5});
    ASSERT_TRUE(ml);
    Bytes b = raw_of(ml.get());
    b.resize(100, 0x99);
    EXPECT_EQ(vyrml_get_from_raw(b.data(), 22, nullptr), nullptr);
    MlPtr a(vyrml_get_from_raw(b.data(), 23, nullptr));
    MlPtr c(vyrml_get_from_raw(b.data(), 100, nullptr));
    ASSERT_TRUE(a);
    ASSERT_TRUE(c);
    EXPECT_EQ(vyrml_cmp(a.get(), ml.get()), 1);
    EXPECT_EQ(vyrml_cmp(c.get(), ml.get()), 1);
}

// Any version but 1 is refused by all three readers, and a refusal leaves
// errno as it was.
TEST(RawForm, OtherVersionsAreRefused) {
    LabelPtr l = rich_label();
    ASSERT_TRUE(l);
    const Bytes forms[] = {raw_of(l.get()), raw_of(l->ml), raw_of(l->rl)};
    const std::pair<uint8_t, uint8_t> versions[] = {{0x00, 0x01}, {0x02, 0x00}, {0x00, 0x00}, {0x01, 0x01}};
    for (auto [lo, hi] : versions) {
        SCOPED_TRACE(testing::Message() << int{lo} << " " << int{hi});
        Bytes whole = forms[0], ml = forms[1], rl = forms[2];
        for (Bytes *b : {&whole, &ml, &rl}) {
            (*b)[0] = lo;
            (*b)[1] = hi;
        }
        errno = 4242;
        EXPECT_EQ(vyrl_get_from_raw(whole.data(), whole.size()), nullptr);
        EXPECT_EQ(vyrml_get_from_raw(ml.data(), ml.size(), nullptr), nullptr);
        EXPECT_EQ(vyrrl_get_from_raw(rl.data(), rl.size()), nullptr);
        EXPECT_EQ(errno, 4242);
    }
}

// The label role reader judges no version, but it does judge lengths, also
// for an offset so large that adding to it would wrap around.
TEST(RawForm, LabelRoleReaderBounds) {
    LabelPtr l = label(mandatory(1, 1, 1, 1), role_part({{2, 2, 2}}, {}));
    ASSERT_TRUE(l);
    Bytes b = raw_of(l.get());
    b[0] = 9;
    RlPtr ok(vyrrl_get_from_raw_lbl(b.data(), b.size(), 26));
    ASSERT_TRUE(ok);
    EXPECT_EQ(ok->roles1[0].id, 2u);
    EXPECT_EQ(vyrrl_get_from_raw_lbl(b.data(), b.size(), 27), nullptr);
    EXPECT_EQ(vyrrl_get_from_raw_lbl(b.data(), b.size(), UINT64_MAX - 5), nullptr);
    EXPECT_EQ(vyrrl_get_from_raw_lbl(b.data(), 25, 0), nullptr);
}

// Counts that ask for entries that are not there fail before any
// allocation is attempted for them.
TEST(RawForm, HugeStoredCountsAreRefused) {
    Bytes whole(26, 0);
    whole[0] = 1;
    whole[18] = whole[19] = whole[20] = whole[21] = 0xff;
    EXPECT_EQ(vyrl_get_from_raw(whole.data(), whole.size()), nullptr);
    Bytes rl(11, 0);
    rl[0] = 1;
    rl[7] = rl[8] = rl[9] = rl[10] = 0xff;
    EXPECT_EQ(vyrrl_get_from_raw(rl.data(), rl.size()), nullptr);
    Bytes ml(18, 0);
    ml[0] = 1;
    ml[14] = ml[15] = ml[16] = ml[17] = 0xff;
    EXPECT_EQ(vyrml_get_from_raw(ml.data(), ml.size(), nullptr), nullptr);
}

TEST(RawForm, ReadersUnderAllocationFailure) {
    for (const ReaderCase &c : reader_cases()) {
        SCOPED_TRACE(c.name);
        const long attempts = vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
            errno = 0;
            const bool got = inj.run([&] { return c.read(c.form.data(), c.form.size()); });
            if (inj.fired()) {
                EXPECT_FALSE(got);
                EXPECT_EQ(errno, ENOMEM);
            } else {
                EXPECT_TRUE(got);
            }
        });
        EXPECT_GT(attempts, 1);
    }
}

TEST(RawForm, WritersUnderAllocationFailure) {
    LabelPtr l = rich_label();
    ASSERT_TRUE(l);
    const std::function<uint8_t *(uint64_t *)> writers[] = {
        [&](uint64_t *size) { return vyrl_get_raw(l.get(), size); },
        [&](uint64_t *size) { return vyrml_get_raw(l->ml, size); },
        [&](uint64_t *size) { return vyrrl_get_raw(l->rl, size); },
    };
    for (const auto &write : writers) {
        vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
            uint64_t size = 999;
            uint8_t *buf = inj.run([&] { return write(&size); });
            if (inj.fired()) {
                EXPECT_EQ(buf, nullptr);
                EXPECT_EQ(size, 999u);  // left alone on failure
                return;
            }
            ASSERT_NE(buf, nullptr);
            EXPECT_NE(size, 999u);
            std::free(buf);
        });
    }
}

}  // namespace
