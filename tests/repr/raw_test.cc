// Raw label forms: exact bytes (which pin the *_raw_size functions too, as
// the writers size their buffers with them), round trips, every truncation
// and a wrong version in every reader, huge stored sizes, allocation failure.
#include <vyr/label.h>
#include <vyr/raw.h>

#include "support/failalloc.h"
#include "support/labels.hh"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstring>
#include <functional>
#include <memory>
#include <sstream>
#include <vector>

namespace {

using Bytes = std::vector<uint8_t>;
using vyr_test::Label;

// A label built field by field, so that any role order, duplicates
// included, reaches the writer as given.
Label label(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type, const Bytes &blob,
            std::vector<vyr_role_t> r1, std::vector<vyr_role_t> r2)
{
	Label l(vyrl_get_new_init_mac(lev, ilev, cat, type));
	vyrrl_put(l->rl);
	l->rl = vyrrl_get_new_alloc(uint32_t(r1.size()), uint32_t(r2.size()));
	std::copy(r1.begin(), r1.end(), l->rl->roles1);
	std::copy(r2.begin(), r2.end(), l->rl->roles2);
	l->ml->blob = blob.empty() ? nullptr : static_cast<unsigned char *>(std::malloc(blob.size()));
	std::copy(blob.begin(), blob.end(), l->ml->blob);
	l->ml->blob_size = uint32_t(blob.size());
	return l;
}

// What a writer gave, as bytes of the size it reported; none for NULL.
template <class T>
Bytes raw(const T *rec, uint8_t *(*write)(const T *, uint64_t *))
{
	uint64_t size = 0;
	std::unique_ptr<uint8_t, decltype(&std::free)> buf(rec ? write(rec, &size) : nullptr, &std::free);
	return Bytes(buf.get(), buf.get() + size);
}
Bytes raw(const vyrl_t *l) { return raw(l, vyrl_get_raw); }
Bytes raw(const vyrml_t *ml) { return raw(ml, vyrml_get_raw); }
Bytes raw(const vyrrl_t *rl) { return raw(rl, vyrrl_get_raw); }

Bytes hex(const char *text)
{
	Bytes b;
	std::istringstream in(text);
	for (unsigned v; in >> std::hex >> v;) b.push_back(uint8_t(v));
	return b;
}

// Blob, both lists, all type and rights bits, and a first list that is not
// in canonical order and holds a duplicate: readers keep stored order.
Label rich_label()
{
	return label(0xfe, 0x7f, 0x8000000000000011u, 0xffff, {0, 1, 2, 0xff, 0x80, 0x41},
	             {{1, 0xdeadbeef, 0xff}, {9, 0, 0x80}, {9, 1, 1}}, {{~0ull, 7, 0x55}});
}

TEST(RawForm, ExactBytes)
{
	EXPECT_EQ((std::vector<uint64_t>{VYRL_RAW_MIN_SIZE, VYRLM_RAW_MIN_SIZE, VYRRL_RAW_MIN_SIZE}), (std::vector<uint64_t>{26, 18, 11}));
	EXPECT_EQ(raw(label(2, 1, 0x11, 4, {}, {}, {}).get()), hex("01 00 04 00 02 01 11 00 00 00 00 00 00 00 00 00 00 00 00 00 00 00 00 00 00 00"));
	EXPECT_EQ(raw(label(3, 2, 0xff, 1, {0x41, 0x42, 0x43, 0x44, 0x45}, {}, {})->ml), hex("01 00 01 00 03 02 ff 00 00 00 00 00 00 00 05 00 00 00 41 42 43 44 45"));
	const vyr_role_t role = {0x0102030405060708u, 0x0a0b0c0d, 5};
	uint8_t out[14] = {}, *cursor = out;
	vyr_roles_to_raw(&cursor, &role, 1);
	EXPECT_EQ(Bytes(out, cursor + 1), hex("08 07 06 05 04 03 02 01 0d 0c 0b 0a 05 00"));  // nothing written past it

	// Role part: counts at 3 and 7, entries in list order.
	Label roles = label(0, 0, 0, 0, {}, {{0x10, 1, 1}}, {{0x30, 3, 3}, {0x20, 2, 2}});
	const Bytes rl = raw(roles->rl);
	ASSERT_EQ(rl.size(), 50u);
	EXPECT_EQ(Bytes(rl.begin(), rl.begin() + 11), (Bytes{1, 0, rl[2], 1, 0, 0, 0, 2, 0, 0, 0}));
	EXPECT_EQ(Bytes({rl[11], rl[24], rl[37]}), hex("10 30 20"));

	// Whole label: counts at 18 and 22, blob at 26, then the role entry.
	Label whole = label(1, 0, 0, 0, {0xb0, 0xb1}, {{0x77, 0x12345678, 0x81}}, {});
	const Bytes b = raw(whole.get());
	EXPECT_EQ(Bytes(b.begin() + 14, b.end()), hex("02 00 00 00 01 00 00 00 00 00 00 00 b0 b1 77 00 00 00 00 00 00 00 78 56 34 12 81"));
	// A list with a count but no array keeps its count and zeroed room.
	Bytes w = b;
	w[22] = 2, w.resize(41 + 26, 0), whole->rl->nroles2 = 2;  // roles2 stays NULL
	EXPECT_EQ(raw(whole.get()), w);
	whole->rl->nroles2 = 0;
}

// One valid form of each kind, its reader, and what the record read back
// writes: all fields and bits, stored order and duplicates survive.
struct ReaderCase {
	const char *name;
	Bytes form, back;
	std::function<Bytes(const uint8_t *, uint64_t)> read;
};

std::vector<ReaderCase> reader_cases()
{
	Label l = rich_label(), one = label(1, 1, 1, 1, {}, {{1, 1, 1}}, {});
	auto whole = [](const uint8_t *b, uint64_t n) { return raw(Label(vyrl_get_from_raw(b, n)).get()); };
	auto ml = [](const uint8_t *b, uint64_t n) {
		uint64_t consumed = 12345;
		vyr_test::MlRef m(vyrml_get_from_raw(b, n, &consumed));
		EXPECT_TRUE(m || consumed == 12345u) << "consumed stored on failure";
		return raw(m.get());
	};
	auto rl = [](const uint8_t *b, uint64_t n) { return raw(vyr_test::RlRef(vyrrl_get_from_raw(b, n)).get()); };
	auto rl_at = [](uint64_t off) {
		return [off](const uint8_t *b, uint64_t n) { return raw(vyr_test::RlRef(vyrrl_get_from_raw_lbl(b, n, off)).get()); };
	};
	const Bytes w = raw(l.get()), m = raw(l->ml), r = raw(l->rl), z = raw(VYRL_ZERO), zm = raw(VYRL_ZERO->ml), zr = raw(VYRL_ZERO->rl);
	return {
		{"whole", w, w, whole}, {"whole, empty", z, z, whole}, {"mandatory", m, m, ml}, {"mandatory, empty", zm, zm, ml},
		{"roles", r, r, rl}, {"roles, empty", zr, zr, rl}, {"roles of whole", w, r, rl_at(26 + 6)},
		{"roles of whole, one", raw(one.get()), raw(one->rl), rl_at(26)},
	};
}

// Every length short of a form gives NULL; its own length and any longer one
// give the record. Each attempt reads an exactly sized heap copy, so a read
// at or past `len` shows under AddressSanitizer. Any version but 1 is
// refused by the three readers that judge it, with errno untouched.
TEST(RawForm, RoundTripsTruncationsAndVersions)
{
	for (const ReaderCase &c : reader_cases()) {
		SCOPED_TRACE(c.name);
		for (size_t len = 0; len <= c.form.size() + 7; ++len) {
			auto exact = std::make_unique<uint8_t[]>(len);
			for (size_t i = 0; i < len; ++i) exact[i] = i < c.form.size() ? c.form[i] : 0xee;
			EXPECT_EQ(c.read(exact.get(), len), len >= c.form.size() ? c.back : Bytes{}) << "len " << len;
		}
		for (const Bytes &v : {Bytes{0, 1}, Bytes{2, 0}, Bytes{0, 0}, Bytes{1, 1}}) {
			Bytes form = c.form;
			std::copy(v.begin(), v.end(), form.begin());
			errno = 4242;
			EXPECT_EQ(c.read(form.data(), form.size()).empty(), std::strstr(c.name, "of whole") == nullptr);
			EXPECT_EQ(errno, 4242);
		}
	}
}

// Stored sizes, equality, use counts, `consumed`, and NULL for what isn't stored.
TEST(RawForm, ReadBack)
{
	Label l = rich_label();
	const Bytes whole = raw(l.get()), ml = raw(l->ml), rl = raw(l->rl), zero = raw(VYRL_ZERO);
	EXPECT_EQ((std::vector<uint64_t>{vyrrawl_size(whole.data()), vyrrawml_size(ml.data()), vyrrawrl_size(rl.data()), whole.size()}),
	          (std::vector<uint64_t>{whole.size(), ml.size(), rl.size(), 26 + 6 + 13 * 4}));
	uint64_t consumed = 0;
	Label back(vyrl_get_from_raw(whole.data(), whole.size())), empty(vyrl_get_from_raw(zero.data(), zero.size()));
	vyr_test::MlRef ml_back(vyrml_get_from_raw(ml.data(), ml.size(), &consumed));
	ASSERT_TRUE(back && empty && ml_back);
	EXPECT_EQ(vyrl_cmp(l.get(), back.get(), 0) + vyrml_cmp(l->ml, ml_back.get()), 2);
	EXPECT_EQ(vyrl_ucnt(back.get()) + vyrml_ucnt(back->ml) + vyrrl_ucnt(back->rl), 3);
	EXPECT_EQ(consumed, 6u + 26);  // where a whole form's roles would start
	EXPECT_TRUE(!empty->ml->blob && !empty->rl->roles1 && !empty->rl->roles2);
	EXPECT_EQ(vyrrl_get_from_raw_lbl(whole.data(), whole.size(), 33), nullptr);  // the label role reader judges lengths,
	EXPECT_EQ(vyrrl_get_from_raw_lbl(whole.data(), whole.size(), UINT64_MAX - 5), nullptr);  // also for an offset that wraps
}

// Stored counts whose 13-byte entries wrap 32 bits around to 4 bytes, and
// a blob of 2^32-1: the length tests must not be fooled by them.
TEST(RawForm, HugeStoredSizesAreRefused)
{
	Bytes whole = hex("01 00 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 0 14 3b b1 13"), rl = hex("01 00 0 0 0 0 0 14 3b b1 13");
	Bytes ml = hex("01 00 0 0 0 0 0 0 0 0 0 0 0 0 ff ff ff ff");  // 0x13b13b14 * 13 = 2^32 + 4
	whole.resize(40), rl.resize(40), ml.resize(40);
	EXPECT_EQ(vyrl_get_from_raw(whole.data(), whole.size()), nullptr);
	EXPECT_EQ(vyrrl_get_from_raw(rl.data(), rl.size()), nullptr);
	EXPECT_EQ(vyrrl_get_from_raw_lbl(whole.data(), whole.size(), 26), nullptr);
	EXPECT_EQ(vyrml_get_from_raw(ml.data(), ml.size(), nullptr), nullptr);
}

// Each allocation fails once in turn, in the three writers and the four
// readers called in a row: only the call that met the failure gives NULL,
// with ENOMEM, and a writer leaves the size alone.
TEST(RawForm, AllocationFailure)
{
	Label l = rich_label();
	const Bytes w = raw(l.get()), m = raw(l->ml), r = raw(l->rl);
	EXPECT_GT(vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		errno = 0;
		uint64_t size[3] = {9, 9, 9};
		uint8_t *buf[3];
		Label whole;
		vyr_test::MlRef ml;
		vyr_test::RlRef rl, rl_of_whole;
		inj.run([&] {
			buf[0] = vyrl_get_raw(l.get(), &size[0]), buf[1] = vyrml_get_raw(l->ml, &size[1]), buf[2] = vyrrl_get_raw(l->rl, &size[2]);
			whole.reset(vyrl_get_from_raw(w.data(), w.size())), ml.reset(vyrml_get_from_raw(m.data(), m.size(), nullptr));
			rl.reset(vyrrl_get_from_raw(r.data(), r.size())), rl_of_whole.reset(vyrrl_get_from_raw_lbl(w.data(), w.size(), 32));
		});
		for (int i = 0; i < 3; ++i) {
			EXPECT_EQ(buf[i] == nullptr, size[i] == 9);
			std::free(buf[i]);
		}
		EXPECT_EQ(!buf[0] + !buf[1] + !buf[2] + !whole + !ml + !rl + !rl_of_whole, inj.fired());
		EXPECT_EQ(errno, inj.fired() ? ENOMEM : 0);
	}), 7);
}

} // namespace
