// Raw label forms: exact bytes, sizes, round trips, every truncation and a
// wrong version in every reader, and allocation failure.
#include <vyr/label.h>
#include <vyr/raw.h>

#include "support/failalloc.h"
#include "support/labels.hh"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <memory>
#include <vector>

namespace {

using Bytes = std::vector<uint8_t>;

using LabelPtr = vyr_test::Label;
using MlPtr = vyr_test::MlRef;
using RlPtr = vyr_test::RlRef;

// A label built field by field, so that any role order, duplicates
// included, reaches the writer as given.
LabelPtr label(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type, const Bytes &blob,
               std::vector<vyr_role_t> r1, std::vector<vyr_role_t> r2)
{
	LabelPtr l(vyrl_get_new_init_mac_roles(lev, ilev, cat, type, nullptr, 0, nullptr, 0));
	vyrrl_t *rl = vyrrl_get_new_alloc(static_cast<uint32_t>(r1.size()), static_cast<uint32_t>(r2.size()));
	if (!l || rl == nullptr)
		return nullptr;
	std::copy(r1.begin(), r1.end(), rl->roles1);
	std::copy(r2.begin(), r2.end(), rl->roles2);
	vyrrl_put(l->rl);
	l->rl = rl;
	if (!blob.empty()) {
		l->ml->blob = static_cast<unsigned char *>(std::malloc(blob.size()));
		std::memcpy(l->ml->blob, blob.data(), blob.size());
		l->ml->blob_size = static_cast<uint32_t>(blob.size());
	}
	return l;
}

// What a writer gave, as bytes, with the size it reported checked.
template <class T>
Bytes raw_of(const T *rec, uint8_t *(*write)(const T *, uint64_t *))
{
	uint64_t size = 0;
	std::unique_ptr<uint8_t, decltype(&std::free)> buf(write(rec, &size), &std::free);
	return buf ? Bytes(buf.get(), buf.get() + size) : Bytes{};
}
Bytes raw(const vyrl_t *l) { return raw_of(l, vyrl_get_raw); }
Bytes raw(const vyrml_t *ml) { return raw_of(ml, vyrml_get_raw); }
Bytes raw(const vyrrl_t *rl) { return raw_of(rl, vyrrl_get_raw); }

// Blob, both lists, all type and rights bits, and a first list that is not
// in canonical order and holds a duplicate: readers keep stored order.
LabelPtr rich_label()
{
	return label(0xfe, 0x7f, 0x8000000000000011u, 0xffff, {0, 1, 2, 0xff, 0x80, 0x41},
	             {{1, 0xdeadbeef, 0xff}, {9, 0, 0x80}, {9, 1, 1}}, {{~0ull, 7, 0x55}});
}

TEST(RawForm, ExactBytes)
{
	EXPECT_EQ(VYRL_RAW_MIN_SIZE, 26u);
	EXPECT_EQ(VYRLM_RAW_MIN_SIZE, 18u);
	EXPECT_EQ(VYRRL_RAW_MIN_SIZE, 11u);

	LabelPtr plain = label(2, 1, 0x11, 4, {}, {}, {});
	Bytes want(26, 0);
	want[0] = 1, want[2] = 4, want[4] = 2, want[5] = 1, want[6] = 0x11;
	EXPECT_EQ(raw(plain.get()), want);

	LabelPtr blob = label(3, 2, 0xff, 1, {0x41, 0x42, 0x43, 0x44, 0x45}, {}, {});
	EXPECT_EQ(raw(blob->ml), (Bytes{1, 0, 1, 0, 3, 2, 0xff, 0, 0, 0, 0, 0, 0, 0, 5, 0, 0, 0,
	                                0x41, 0x42, 0x43, 0x44, 0x45}));
	EXPECT_EQ(vyrml_raw_size(blob->ml), 23u);

	// Role part: counts at the odd offsets 3 and 7, entries in list order.
	LabelPtr roles = label(0, 0, 0, 0, {}, {{0x10, 1, 1}}, {{0x30, 3, 3}, {0x20, 2, 2}});
	const Bytes rl = raw(roles->rl);
	ASSERT_EQ(rl.size(), 50u);
	EXPECT_EQ(vyrrl_raw_size(roles->rl), 50u);
	EXPECT_EQ(Bytes(rl.begin(), rl.begin() + 2), (Bytes{1, 0}));
	EXPECT_EQ(Bytes(rl.begin() + 3, rl.begin() + 11), (Bytes{1, 0, 0, 0, 2, 0, 0, 0}));
	EXPECT_EQ(rl[11], 0x10);
	EXPECT_EQ(rl[24], 0x30);
	EXPECT_EQ(rl[37], 0x20);

	// Whole label: counts at 18 and 22, blob at 26, then the role entry.
	LabelPtr whole = label(1, 0, 0, 0, {0xb0, 0xb1}, {{0x77, 0x12345678, 0x81}}, {});
	const Bytes b = raw(whole.get());
	EXPECT_EQ(vyrl_raw_size(whole.get()), 41u);
	EXPECT_EQ(Bytes(b.begin() + 14, b.end()),
	          (Bytes{2, 0, 0, 0, 1, 0, 0, 0, 0, 0, 0, 0, 0xb0, 0xb1,
	                 0x77, 0, 0, 0, 0, 0, 0, 0, 0x78, 0x56, 0x34, 0x12, 0x81}));
}

TEST(RawForm, RoleEntries)
{
	const vyr_role_t role = {0x0102030405060708u, 0x0a0b0c0d, 5};
	uint8_t out[14];
	std::memset(out, 0xaa, sizeof out);
	uint8_t *cursor = out;
	vyr_roles_to_raw(&cursor, &role, 1);
	EXPECT_EQ(cursor, out + 13);
	EXPECT_EQ(Bytes(out, out + 14), (Bytes{8, 7, 6, 5, 4, 3, 2, 1, 0xd, 0xc, 0xb, 0xa, 5, 0xaa}));

	vyr_role_t back[2];
	std::memset(back, 0x5a, sizeof back);
	const uint8_t *in = out;
	vyr_roles_from_raw(back, 1, &in);
	EXPECT_EQ(in, out + 13);
	EXPECT_EQ(vyr_role_cmp(&back[0], &role), 1);
	EXPECT_EQ(back[1].id, 0x5a5a5a5a5a5a5a5au);  // nothing past n is touched

	// n 0 touches neither the array nor the cursor.
	vyr_roles_to_raw(&cursor, nullptr, 0);
	vyr_roles_from_raw(nullptr, 0, &in);
	EXPECT_EQ(cursor, out + 13);
	EXPECT_EQ(in, out + 13);
}

// Every field, all bits of type and rights, stored order and duplicates
// survive all three round trips; the size functions of stored forms agree
// with the writers.
TEST(RawForm, RoundTrips)
{
	LabelPtr l = rich_label();
	const Bytes whole = raw(l.get()), ml = raw(l->ml), rl = raw(l->rl);
	EXPECT_EQ(whole.size(), 26u + 6 + 13 * 4);
	EXPECT_EQ(vyrrawl_size(whole.data()), whole.size());
	EXPECT_EQ(vyrrawml_size(ml.data()), ml.size());
	EXPECT_EQ(vyrrawrl_size(rl.data()), rl.size());

	LabelPtr back(vyrl_get_from_raw(whole.data(), whole.size()));
	ASSERT_TRUE(back);
	EXPECT_EQ(vyrl_cmp(l.get(), back.get(), 0), 1);
	EXPECT_EQ(vyrl_ucnt(back.get()) + vyrml_ucnt(back->ml) + vyrrl_ucnt(back->rl), 3);
	ASSERT_EQ(back->rl->nroles1, 3u);
	EXPECT_EQ(back->rl->roles1[0].id, 1u);
	EXPECT_EQ(back->rl->roles1[2].id, 9u);

	uint64_t consumed = 0;
	MlPtr ml_back(vyrml_get_from_raw(ml.data(), ml.size(), &consumed));
	ASSERT_TRUE(ml_back);
	EXPECT_EQ(vyrml_cmp(l->ml, ml_back.get()), 1);
	EXPECT_EQ(consumed, 6u + 26);  // where a whole form's roles would start
	RlPtr rl_back(vyrrl_get_from_raw(rl.data(), rl.size()));
	ASSERT_TRUE(rl_back);
	EXPECT_EQ(vyrrl_cmp(l->rl, rl_back.get(), 0), 1);

	// Nothing stored reads back as NULL pointers.
	const Bytes zero = raw(VYRL_ZERO);
	LabelPtr empty(vyrl_get_from_raw(zero.data(), zero.size()));
	ASSERT_TRUE(empty);
	EXPECT_EQ(empty->ml->blob, nullptr);
	EXPECT_EQ(empty->rl->roles1, nullptr);
	EXPECT_EQ(empty->rl->roles2, nullptr);
}

// The mandatory-part reader's `consumed` is the offset that the label role
// reader wants, so the two read a whole form with an empty blob.
TEST(RawForm, ConsumedChainsIntoTheLabelRoleReader)
{
	LabelPtr l = label(2, 2, 2, 2, {}, {{5, 5, 5}}, {{4, 4, 4}});
	Bytes whole = raw(l.get());
	uint64_t consumed = 0;
	MlPtr ml(vyrml_get_from_raw(whole.data(), 18, &consumed));
	ASSERT_TRUE(ml);
	EXPECT_EQ(consumed, 26u);
	EXPECT_EQ(vyrml_cmp(ml.get(), l->ml), 1);
	whole[0] = 9;  // the label role reader judges no version...
	RlPtr rl(vyrrl_get_from_raw_lbl(whole.data(), whole.size(), consumed));
	ASSERT_TRUE(rl);
	EXPECT_EQ(vyrrl_cmp(rl.get(), l->rl, 0), 1);
	// ...but it does judge lengths, also for an offset that would wrap around.
	EXPECT_EQ(vyrrl_get_from_raw_lbl(whole.data(), whole.size(), 27), nullptr);
	EXPECT_EQ(vyrrl_get_from_raw_lbl(whole.data(), whole.size(), UINT64_MAX - 5), nullptr);
	EXPECT_EQ(vyrrl_get_from_raw_lbl(whole.data(), 25, 0), nullptr);
}

// A list with a count but no array: the whole-label writer keeps the count
// and writes no entries from it.
TEST(RawForm, WholeLabelWriterSkipsAMissingList)
{
	LabelPtr l = label(1, 1, 1, 1, {}, {}, {{3, 3, 3}});
	l->rl->nroles1 = 2;  // roles1 stays NULL
	const Bytes b = raw(l.get());
	l->rl->nroles1 = 0;
	ASSERT_EQ(b.size(), 26u + 13 * 3);
	EXPECT_EQ(Bytes(b.begin() + 18, b.begin() + 26), (Bytes{2, 0, 0, 0, 1, 0, 0, 0}));
	EXPECT_EQ(b[52], 3);  // roles2 behind the room of the two missing entries
}

// One valid form of each kind and its reader (true: it gave a record).
struct ReaderCase {
	const char *name;
	Bytes form;
	std::function<bool(const uint8_t *, uint64_t)> read;
};

std::vector<ReaderCase> reader_cases()
{
	LabelPtr l = rich_label();
	LabelPtr one = label(1, 1, 1, 1, {}, {{1, 1, 1}}, {});
	auto whole = [](const uint8_t *b, uint64_t n) { return LabelPtr(vyrl_get_from_raw(b, n)) != nullptr; };
	auto ml = [](const uint8_t *b, uint64_t n) {
		uint64_t consumed = 12345;
		MlPtr m(vyrml_get_from_raw(b, n, &consumed));
		if (!m) {
			EXPECT_EQ(consumed, 12345u);  // stored on success only
		}
		return m != nullptr;
	};
	auto rl = [](const uint8_t *b, uint64_t n) { return RlPtr(vyrrl_get_from_raw(b, n)) != nullptr; };
	auto rl_at = [](uint64_t off) {
		return [off](const uint8_t *b, uint64_t n) { return RlPtr(vyrrl_get_from_raw_lbl(b, n, off)) != nullptr; };
	};
	return {
		{"whole", raw(l.get()), whole},          {"whole, empty", raw(VYRL_ZERO), whole},
		{"mandatory", raw(l->ml), ml},           {"mandatory, empty", raw(VYRL_ZERO->ml), ml},
		{"roles", raw(l->rl), rl},               {"roles, empty", raw(VYRL_ZERO->rl), rl},
		{"roles of whole", raw(l.get()), rl_at(26 + 6)}, {"roles of whole, one", raw(one.get()), rl_at(26)},
	};
}

// Every length short of a form gives NULL; its own length and any longer one
// give a record. Each attempt reads an exactly sized heap copy, so a read at
// or past `len` shows under AddressSanitizer.
TEST(RawForm, EveryTruncationFails)
{
	for (const ReaderCase &c : reader_cases()) {
		SCOPED_TRACE(c.name);
		ASSERT_FALSE(c.form.empty());
		for (std::size_t len = 0; len <= c.form.size() + 7; ++len) {
			Bytes form = c.form;
			form.resize(len, 0xee);
			auto exact = std::make_unique<uint8_t[]>(len);
			std::copy(form.begin(), form.end(), exact.get());
			EXPECT_EQ(c.read(exact.get(), len), len >= c.form.size()) << "len " << len;
		}
	}
}

// Any version but 1 is refused by all three readers, with errno untouched.
TEST(RawForm, OtherVersionsAreRefused)
{
	LabelPtr l = rich_label();
	for (const Bytes &v : {Bytes{0, 1}, Bytes{2, 0}, Bytes{0, 0}, Bytes{1, 1}}) {
		Bytes whole = raw(l.get()), ml = raw(l->ml), rl = raw(l->rl);
		for (Bytes *b : {&whole, &ml, &rl})
			std::copy(v.begin(), v.end(), b->begin());
		errno = 4242;
		EXPECT_EQ(vyrl_get_from_raw(whole.data(), whole.size()), nullptr);
		EXPECT_EQ(vyrml_get_from_raw(ml.data(), ml.size(), nullptr), nullptr);
		EXPECT_EQ(vyrrl_get_from_raw(rl.data(), rl.size()), nullptr);
		EXPECT_EQ(errno, 4242);
	}
}

// Stored counts whose 13-byte entries wrap 32 bits around to 4 bytes, and
// a blob of 2^32-1: the length tests must not be fooled by them.
TEST(RawForm, HugeStoredSizesAreRefused)
{
	Bytes whole(40, 0), rl(40, 0), ml(40, 0);
	whole[0] = rl[0] = ml[0] = 1;
	const Bytes wrap = {0x14, 0x3b, 0xb1, 0x13};  // 0x13b13b14 * 13 = 2^32 + 4
	std::copy(wrap.begin(), wrap.end(), whole.begin() + 18);
	std::copy(wrap.begin(), wrap.end(), rl.begin() + 7);
	std::fill(ml.begin() + 14, ml.begin() + 18, 0xff);
	EXPECT_EQ(vyrl_get_from_raw(whole.data(), whole.size()), nullptr);
	EXPECT_EQ(vyrrl_get_from_raw(rl.data(), rl.size()), nullptr);
	EXPECT_EQ(vyrrl_get_from_raw_lbl(whole.data(), whole.size(), 26), nullptr);
	EXPECT_EQ(vyrml_get_from_raw(ml.data(), ml.size(), nullptr), nullptr);
}

TEST(RawForm, ReadersUnderAllocationFailure)
{
	for (const ReaderCase &c : reader_cases()) {
		SCOPED_TRACE(c.name);
		const long attempts = vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			errno = 0;
			const bool got = inj.run([&] { return c.read(c.form.data(), c.form.size()); });
			EXPECT_EQ(got, !inj.fired());
			if (inj.fired()) {
				EXPECT_EQ(errno, ENOMEM);
			}
		});
		EXPECT_GT(attempts, 1);
	}
}

TEST(RawForm, WritersUnderAllocationFailure)
{
	LabelPtr l = rich_label();
	const std::function<uint8_t *(uint64_t *)> writers[] = {
		[&](uint64_t *size) { return vyrl_get_raw(l.get(), size); },
		[&](uint64_t *size) { return vyrml_get_raw(l->ml, size); },
		[&](uint64_t *size) { return vyrrl_get_raw(l->rl, size); },
	};
	for (const auto &write : writers) {
		vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			uint64_t size = 999;
			uint8_t *buf = inj.run([&] { return write(&size); });
			EXPECT_EQ(buf == nullptr, inj.fired());
			EXPECT_EQ(size == 999, inj.fired());  // left alone on failure
			std::free(buf);
		});
	}
}

} // namespace
