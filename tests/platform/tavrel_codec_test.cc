// The stored form of the label service: exact bytes and the decoder's
// refusal of anything but a complete, canonical form.
#include <cerrno>
#include <vector>

#include <gtest/gtest.h>

#include "tavrel_test_util.hh"

namespace {

using tavrel_test::encode;
using tavrel_test::Label;
using tavrel_test::Records;

// Decodes into records with room for anything; the decoder's errno on failure.
int decode(const std::vector<uint8_t> &bytes, Label *out)
{
	// An exactly sized heap copy, so that a read past the end shows under ASan.
	const std::vector<uint8_t> exact(bytes);
	tavrel::StoredLabel s;
	if (int err = tavrel::decode_label(exact.data(), exact.size(), &s))
		return err;
	Records r;
	r.offer(s.blob_size, s.nroles1, s.nroles2);
	EXPECT_EQ(tavrel::fill_label(s, &r.l), 0);
	*out = r.value();
	return 0;
}

// Distinct bytes in every field, so that a wrong width, offset or byte order
// shows in the bytes.
TEST(StoredForm, ExactBytes)
{
	const struct {
		Label label;
		std::vector<uint8_t> bytes;
	} cases[] = {
	    {{2, 1, 0x11, 4, {}, {}, {}},
	     {0x01, 0x00, 0x04, 0x00, 0x02, 0x01, 0x11, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0, 0}},
	    {{3, 2, 0x0102030405060708, 0xabcd, {0xee, 0xff}, {{0x0102030405060708, 0x0a0b0c0d, 5}}, {{9, 1, 0x80}}},
	     {0x01, 0x00, 0xcd, 0xab, 0x03, 0x02, 0x08, 0x07, 0x06, 0x05, 0x04, 0x03, 0x02, 0x01,  // head
	      0x02, 0, 0, 0, 0x01, 0, 0, 0, 0x01, 0, 0, 0,                                        // sizes
	      0xee, 0xff,                                                                         // blob
	      0x08, 0x07, 0x06, 0x05, 0x04, 0x03, 0x02, 0x01, 0x0d, 0x0c, 0x0b, 0x0a, 0x05,       // roles1
	      0x09, 0, 0, 0, 0, 0, 0, 0, 0x01, 0, 0, 0, 0x80}},                                   // roles2
	};
	for (const auto &c : cases) {
		EXPECT_EQ(encode(c.label), c.bytes) << c.label;
		Label back;
		ASSERT_EQ(decode(c.bytes, &back), 0) << c.label;
		EXPECT_EQ(back, c.label);
	}
}

std::vector<uint8_t> with(std::vector<uint8_t> b, size_t off, std::vector<uint8_t> patch)
{
	std::copy(patch.begin(), patch.end(), b.begin() + static_cast<long>(off));
	return b;
}

// Whatever is stored was written by this service or tampered with: only an
// exact, canonical form may become a label.
TEST(StoredForm, DecoderRefusesAnythingButAnExactCanonicalForm)
{
	const Label l{9, 8, 7, 6, {1, 2, 3}, {{5, 1, 1}, {4, 2, 2}}, {{3, 3, 3}, {2, 2, 2}}};
	const std::vector<uint8_t> full = encode(l);
	Label back;
	ASSERT_EQ(decode(full, &back), 0);
	EXPECT_EQ(back, l);
	for (size_t len = 0; len < full.size(); ++len)
		EXPECT_EQ(decode(std::vector<uint8_t>(full.begin(), full.begin() + static_cast<long>(len)), &back), EIO)
		    << "cut to " << len;
	std::vector<uint8_t> longer = full;
	longer.push_back(0);

	const size_t roles1 = 26 + 3, roles2 = roles1 + 2 * 13;  // first id of each list
	const struct {
		const char *what;
		std::vector<uint8_t> bytes;
		int err;
	} cases[] = {
	    {"trailing byte", longer, EIO},
	    {"version 2", with(full, 0, {2, 0}), EINVAL},
	    {"version bytes swapped", with(full, 0, {0, 1}), EINVAL},
	    // The announced size must not wrap, whatever the arithmetic width.
	    {"all sizes at their maximum", with(encode(Label{}), 14, std::vector<uint8_t>(12, 0xff)), EIO},
	    {"roles1 duplicate id", with(full, roles1, {4}), EIO},
	    {"roles1 ascending", with(full, roles1, {3}), EIO},
	    {"roles2 ascending", with(full, roles2, {1}), EIO},
	};
	for (const auto &c : cases)
		EXPECT_EQ(decode(c.bytes, &back), c.err) << c.what;
}

} // namespace
