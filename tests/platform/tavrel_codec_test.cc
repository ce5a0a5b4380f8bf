// The stored form of the label service: exact bytes and the decoder's
// refusal of anything but a complete, canonical form.
#include <cerrno>
#include <vector>

#include <gtest/gtest.h>

#include "label_codec.hh"
#include "tavrel_test_util.hh"

namespace {

using tavrel_test::Label;
using tavrel_test::Records;

std::vector<uint8_t> encode(const Label &v)
{
	Records r;
	r.assign(v);
	EXPECT_EQ(tavrel::check_label(&r.l), 0);
	std::vector<uint8_t> out(tavrel::encoded_size(&r.l));
	tavrel::encode_label(&r.l, out.data());
	return out;
}

// Decodes into records with room for anything; the decoder's errno on failure.
int decode(const std::vector<uint8_t> &bytes, Label *out)
{
	// An exactly sized heap copy, so a read past the end shows under ASan.
	std::vector<uint8_t> exact(bytes);
	tavrel::StoredLabel s;
	if (int err = tavrel::decode_label(exact.data(), exact.size(), &s))
		return err;
	Records r;
	r.offer(s.blob_size, s.nroles1, s.nroles2);
	EXPECT_EQ(tavrel::fill_label(s, &r.l), 0);
	*out = r.value();
	return 0;
}

TEST(StoredForm, ExactBytes)
{
	const struct {
		const char *what;
		Label label;
		std::vector<uint8_t> bytes;
	} cases[] = {
	    {"plain head", {2, 1, 0x11, 4, {}, {}, {}},
	     {0x01, 0x00, 0x04, 0x00, 0x02, 0x01, 0x11, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0}},
	    {"blob, one role in each list",
	     {3, 2, 0x0102030405060708, 0xabcd, {0xee, 0xff}, {{0x0102030405060708, 0x0a0b0c0d, 5}}, {{9, 1, 0x80}}},
	     {0x01, 0x00, 0xcd, 0xab, 0x03, 0x02, 0x08, 0x07, 0x06, 0x05, 0x04, 0x03, 0x02, 0x01,  // head
	      0x02, 0, 0, 0, 0x01, 0, 0, 0, 0x01, 0, 0, 0,                                        // sizes
	      0xee, 0xff,                                                                         // blob
	      0x08, 0x07, 0x06, 0x05, 0x04, 0x03, 0x02, 0x01, 0x0d, 0x0c, 0x0b, 0x0a, 0x05,       // roles1
	      0x09, 0, 0, 0, 0, 0, 0, 0, 0x01, 0, 0, 0, 0x80}},                                   // roles2
	};
	for (const auto &c : cases) {
		EXPECT_EQ(encode(c.label), c.bytes) << c.what;
		Label back;
		ASSERT_EQ(decode(c.bytes, &back), 0) << c.what;
		EXPECT_EQ(back, c.label) << c.what;
	}
}

TEST(StoredForm, EveryBitOfEveryFieldSurvives)
{
	for (int bit = 0; bit < 64; ++bit) {
		Label l{static_cast<uint8_t>(1u << (bit % 8)), static_cast<uint8_t>(0x80u >> (bit % 8)),
		        uint64_t{1} << bit, static_cast<uint16_t>(1u << (bit % 16)), {static_cast<uint8_t>(bit)},
		        {{uint64_t{1} << bit, 1u << (bit % 32), static_cast<uint8_t>(1u << (bit % 8))}}, {}};
		Label back;
		ASSERT_EQ(decode(encode(l), &back), 0);
		EXPECT_EQ(back, l) << "bit " << bit;
	}
}

TEST(StoredForm, EveryTruncationAndEveryExtensionIsRefused)
{
	Label l{9, 8, 7, 6, {1, 2, 3}, {{5, 1, 1}, {4, 2, 2}}, {{3, 3, 3}}};
	const std::vector<uint8_t> full = encode(l);
	for (size_t len = 0; len < full.size(); ++len) {
		Label back;
		EXPECT_EQ(decode(std::vector<uint8_t>(full.begin(), full.begin() + len), &back), EIO) << "length " << len;
	}
	std::vector<uint8_t> longer = full;
	longer.push_back(0);
	Label back;
	EXPECT_EQ(decode(longer, &back), EIO);
	ASSERT_EQ(decode(full, &back), 0);
	EXPECT_EQ(back, l);
}

TEST(StoredForm, HugeCountsDoNotWrapTheLengthCheck)
{
	// blob_size and both counts at their maximum: the announced form is far
	// beyond the 26 bytes present, whatever the arithmetic width.
	std::vector<uint8_t> b = encode(Label{});
	for (size_t off = 14; off < 26; ++off)
		b[off] = 0xff;
	Label back;
	EXPECT_EQ(decode(b, &back), EIO);
}

} // namespace
