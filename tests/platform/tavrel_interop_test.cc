// The stand-in against libvyr itself: the label service stores exactly the
// whole-label raw form that libvyr writes, and libvyr's kernel calls get
// back through the stand-in what they set.
#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <vyr/kernel.h>
#include <vyr/label.h>
#include <vyr/raw.h>

#include "label_codec.hh"
#include "tavrel_test_util.hh"

namespace {

using tavrel_test::Label;
using tavrel_test::Records;

const Label kLabels[] = {
    {2, 1, 0x11, 4, {}, {}, {}},
    {3, 2, 0xff, 1, {0x41, 0x42, 0x43, 0x44, 0x45}, {}, {}},
    {255, 254, ~uint64_t{0}, 0xffff, {9, 8, 7}, {{~uint64_t{0}, 7, 0xff}, {3, 1, 1}}, {{12, 0xabcdef01, 0x80}}},
};

std::vector<uint8_t> libvyr_raw(const vyrl_t *l)
{
	uint64_t size = 0;
	uint8_t *raw = vyrl_get_raw(l, &size);
	if (!raw)
		return {};
	std::vector<uint8_t> out(raw, raw + size);
	std::free(raw);
	return out;
}

TEST(Interop, StoredFormIsLibvyrsRawForm)
{
	for (const Label &v : kLabels) {
		Records r;
		r.assign(v);
		std::vector<uint8_t> mine(tavrel::encoded_size(&r.l));
		tavrel::encode_label(&r.l, mine.data());
		EXPECT_EQ(mine, libvyr_raw(&r.l)) << v;
	}
}

TEST(Interop, LibvyrKernelCallsRoundTripThroughTheStandIn)
{
	tavrel_test::ScratchDir dir;
	ASSERT_TRUE(dir.ok());
	if (!tavrel_test::supports_xattr(dir.path(), "user", false))
		GTEST_SKIP() << dir.path() << " keeps no user.* extended attributes";
	setenv("VYR_TAVREL_XATTR_NS", "user", 1);
	setenv("VYR_TAVREL_STATE_DIR", (dir / "state").c_str(), 1);
	vyr_release();
	ASSERT_EQ(vyr_init(), 0);
	const std::string f = dir / "f";
	std::fclose(std::fopen(f.c_str(), "w"));
	for (const Label &v : kLabels) {
		Records r;
		r.assign(v);
		ASSERT_EQ(vyr_set_path(f.c_str(), &r.l), 0) << v;
		vyrl_t *got = vyr_get_path(f.c_str());
		ASSERT_NE(got, nullptr) << v;
		EXPECT_EQ(libvyr_raw(got), libvyr_raw(&r.l)) << v;
		vyrl_put(got);

		ASSERT_EQ(vyr_set_pid(0, &r.l), 0) << v;
		got = vyr_get_pid(0);
		ASSERT_NE(got, nullptr) << v;
		EXPECT_EQ(libvyr_raw(got), libvyr_raw(&r.l)) << v;
		vyrl_put(got);
	}
	vyr_release();
	unsetenv("VYR_TAVREL_XATTR_NS");
	unsetenv("VYR_TAVREL_STATE_DIR");
}

} // namespace
