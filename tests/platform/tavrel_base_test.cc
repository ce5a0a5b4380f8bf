// The label service stand-in driven through its three exported functions, as
// libvyr drives it: the E2BIG exchange, the stored form and its decoder, the
// failure answers and the process store.  Paths, links, descriptors and
// processes seen through libvyr are tested in tests/kernel.
#include <algorithm>
#include <array>
#include <cerrno>
#include <type_traits>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <sys/xattr.h>
#include <unistd.h>
#include <vector>

#include <gtest/gtest.h>

#include "contract/tavrel_base.h"
#include "label_codec.hh"
#include "support/failalloc.h"
#include "support/scratch_dir.hh"

// Field by field: the padding of a role entry holds nothing.
static bool operator==(const vyr_role_t &a, const vyr_role_t &b)
{
	return a.id == b.id && a.attr == b.attr && a.rights == b.rights;
}

namespace {

using Roles = std::vector<vyr_role_t>;
constexpr uint8_t kSentinel = 0xa5;

struct Label {
	uint8_t lev = 0, ilev = 0;
	uint64_t cat = 0;
	uint16_t type = 0;
	std::vector<uint8_t> blob;
	Roles roles1, roles2;
	bool operator==(const Label &) const = default;
};

// Label records with buffers owned here.  Every byte starts at a sentinel,
// so that image() tells whether a command wrote anything.
struct Records {
	vyrml_t ml;
	vyrrl_t rl;
	vyrl_t l;
	std::vector<uint8_t> blob;
	Roles r1, r2;

	Records()
	{
		std::memset(&ml, kSentinel, sizeof ml), std::memset(&rl, kSentinel, sizeof rl), std::memset(&l, kSentinel, sizeof l);
		l.ml = &ml, l.rl = &rl, l.ucnt = 1;
		point();
	}
	explicit Records(const Label &v) : Records()
	{
		ml.lev = v.lev, ml.ilev = v.ilev, ml.cat = v.cat, ml.type = v.type;
		blob = v.blob, r1 = v.roles1, r2 = v.roles2;
		point();
	}
	Records(const Records &) = delete;
	// Offers buffers of these sizes, all sentinel bytes.
	void offer(uint32_t nb, uint32_t n1, uint32_t n2)
	{
		blob.assign(nb, kSentinel), r1.assign(n1, sentinel_role()), r2.assign(n2, sentinel_role());
		point();
	}
	static vyr_role_t sentinel_role()
	{
		vyr_role_t r;
		std::memset(&r, kSentinel, sizeof r);
		return r;
	}
	void point() // NULL for a size of 0
	{
		ml.blob = blob.empty() ? nullptr : blob.data(), ml.blob_size = uint32_t(blob.size());
		rl.roles1 = r1.empty() ? nullptr : r1.data(), rl.nroles1 = uint32_t(r1.size());
		rl.roles2 = r2.empty() ? nullptr : r2.data(), rl.nroles2 = uint32_t(r2.size());
	}
	Label value() const
	{
		return {ml.lev, ml.ilev, ml.cat, ml.type, {ml.blob, ml.blob + ml.blob_size},
		        {rl.roles1, rl.roles1 + rl.nroles1}, {rl.roles2, rl.roles2 + rl.nroles2}};
	}
	std::string image() const
	{
		// The records are cleared byte for byte, padding included; role
		// entries come from anywhere, so only their fields are compared.
		auto bytes = [](const auto &v) { return std::string(reinterpret_cast<const char *>(&v), sizeof v); };
		std::string out = bytes(l) + bytes(ml) + bytes(rl) + std::string(blob.begin(), blob.end());
		for (const Roles *list : {&r1, &r2})
			for (const vyr_role_t &r : *list)
				out += bytes(r.id) + bytes(r.attr) + bytes(r.rights);
		return out;
	}
};

const Label kPlain{2, 1, 0x11, 4, {}, {}, {}};
const Label kBlob{3, 2, 0xff, 1, {0x41, 0x42, 0x43, 0x44, 0x45}, {}, {}};
const Label kRoles{0, 7, 0, 0, {}, {{9, 1, 5}, {1, 2, 3}}, {{7, 0xdeadbeef, 0xff}}};

// Every field at its extremes.  A blob of 2000 bytes makes the stored form
// outgrow the service's inline buffer, so that it allocates.
Label full_label(size_t blob_bytes = 64)
{
	Label l{255, 254, ~uint64_t{0}, 0xffff, {}, {}, {{~uint64_t{0}, 1, 0x80}, {5, 2, 1}, {0, 3, 2}}};
	for (size_t i = 0; i < blob_bytes; ++i)
		l.blob.push_back(uint8_t(i * 7));
	for (uint64_t id = 16; id > 0; --id)
		l.roles1.push_back({id << 40, uint32_t(id), uint8_t(id)});
	return l;
}

std::vector<uint8_t> encode(const Label &v)
{
	Records r(v);
	std::vector<uint8_t> out(tavrel::encoded_size(&r.l));
	tavrel::encode_label(&r.l, out.data());
	return out;
}

// Decodes from an exactly sized heap copy (a read past its end shows under
// ASan); the decoder's errno on failure.
int decode(std::vector<uint8_t> bytes, Label *out)
{
	tavrel::StoredLabel s;
	if (int err = tavrel::decode_label(bytes.data(), bytes.size(), &s))
		return err;
	Records r;
	r.offer(s.blob_size, s.nroles1, s.nroles2);
	EXPECT_EQ(tavrel::fill_label(s, &r.l), 0);
	*out = r.value();
	return 0;
}

// One command; 0 or the errno of a failure (-1: not the documented -1 and
// errno).  Reports nothing through gtest, so forked children may use it.
int run(int cmd, vyr_label_cmd_t a)
{
	errno = 0;
	const int rc = tavrel_syscall_ioctl(cmd, &a);
	return rc == 0 ? 0 : rc == -1 && errno ? errno : -1;
}

// The argument record for a path or a number.
template <class T> vyr_label_cmd_t arg(const T &target, Records &r)
{
	vyr_label_cmd_t a{};
	if constexpr (std::is_integral_v<T>)
		a.target.num = target;
	else
		a.target.path = target.c_str();
	a.label = &r.l;
	return a;
}

// Reads a label as libvyr does: no room first, then exactly the room asked.
int get_label(int cmd, vyr_label_cmd_t a, Records &r, Label *out)
{
	r.offer(0, 0, 0);
	int err;
	for (int pass = 0; (err = run(cmd, a)) == E2BIG && pass < 8; ++pass)
		r.offer(r.ml.blob_size, r.rl.nroles1, r.rl.nroles2);
	if (err == 0)
		*out = r.value();
	return err;
}

constexpr int kGetPath = TAVREL_CMD_GET_PATH, kSetPath = TAVREL_CMD_SET_PATH;
constexpr int kGetPid = TAVREL_CMD_GET_PID, kSetPid = TAVREL_CMD_SET_PID;
constexpr int64_t kSelf = 0;

// Distinct bytes in every field, so that a wrong width, offset or byte order
// shows; the decoder takes only an exact, canonical form.
TEST(StoredForm, ExactBytesAndRefusals)
{
	const Label l{3, 2, 0x0102030405060708, 0xabcd, {0xee, 0xff}, {{0x0102030405060708, 0x0a0b0c0d, 5}, {4, 2, 2}},
	              {{9, 1, 0x80}, {2, 3, 4}}};
	const std::vector<uint8_t> bytes{
	    1, 0, 0xcd, 0xab, 3, 2, 8, 7, 6, 5, 4, 3, 2, 1, 2, 0, 0, 0, 2, 0, 0, 0, 2, 0, 0, 0, // head, sizes
	    0xee, 0xff, 8, 7, 6, 5, 4, 3, 2, 1, 0x0d, 0x0c, 0x0b, 0x0a, 5, 4, 0, 0, 0, 0, 0, 0, 0, 2, 0, 0, 0, 2,
	    9, 0, 0, 0, 0, 0, 0, 0, 1, 0, 0, 0, 0x80, 2, 0, 0, 0, 0, 0, 0, 0, 3, 0, 0, 0, 4};
	EXPECT_EQ(encode(l), bytes);
	Label back;
	ASSERT_EQ(decode(bytes, &back), 0);
	EXPECT_EQ(back, l);
	for (size_t len = 0; len < bytes.size(); ++len)
		EXPECT_EQ(decode({bytes.begin(), bytes.begin() + long(len)}, &back), EIO) << "cut to " << len;
	auto with = [](std::vector<uint8_t> b, size_t off, std::vector<uint8_t> patch) {
		b.resize(std::max(b.size(), off + patch.size()));
		return std::copy(patch.begin(), patch.end(), b.begin() + long(off)), b;
	};
	const struct {
		const char *what;
		std::vector<uint8_t> bytes;
		int err;
	} cases[] = {
	    {"trailing byte", with(bytes, bytes.size(), {0}), EIO},
	    {"version 2", with(bytes, 0, {2, 0}), EINVAL},
	    {"version bytes swapped", with(bytes, 0, {0, 1}), EINVAL},
	    // The announced size must not wrap, whatever the arithmetic width.
	    {"all sizes at their maximum", with(encode(Label{}), 14, std::vector<uint8_t>(12, 0xff)), EIO},
	    {"roles1 duplicate id", with(bytes, 28, {4, 0, 0, 0, 0, 0, 0, 0}), EIO},
	    {"roles1 ascending", with(bytes, 28, {3, 0, 0, 0, 0, 0, 0, 0}), EIO},
	    {"roles2 ascending", with(bytes, 67, {10}), EIO},
	};
	for (const auto &c : cases)
		EXPECT_EQ(decode(c.bytes, &back), c.err) << c.what;
}

class ServiceTest : public ::testing::Test {
protected:
	void SetUp() override
	{
		ASSERT_TRUE(dir_.ok());
		setenv("VYR_TAVREL_XATTR_NS", "user", 1);
		setenv("VYR_TAVREL_STATE_DIR", state_.c_str(), 1); // made by the service on first use
		ASSERT_EQ(tavrel_open(), 0);
		std::ofstream(file_).flush();
		if (setxattr(file_.c_str(), "user.probe", "1", 1, 0) != 0)
			GTEST_SKIP() << "no user.* attributes under " << dir_.path() << "; point TMPDIR elsewhere";
		removexattr(file_.c_str(), "user.probe");
	}
	void TearDown() override { tavrel_close(); }

	template <class Target> void set(int cmd, const Target &t, const Label &v)
	{
		Records r(v);
		ASSERT_EQ(run(cmd, arg(t, r)), 0);
	}
	template <class Target> Label get(int cmd, const Target &t)
	{
		Records r;
		Label out;
		EXPECT_EQ(get_label(cmd, arg(t, r), r, &out), 0);
		return out;
	}

	vyr_test::ScratchDir dir_;
	const std::string state_ = dir_ / "run/tavrel", file_ = dir_ / "f";
};

// libvyr's retry loop ends only when the service stops answering E2BIG and
// allocates exactly the sizes it is told: they must be exact, exactly that
// room must suffice, and a short offer must leave every other byte alone.
TEST_F(ServiceTest, GetAnswersE2bigWithTheExactSizesUntilTheRoomSuffices)
{
	Records r0; // no label yet: the zero label, with no room offered
	ASSERT_EQ(run(kGetPath, arg(file_, r0)), 0);
	EXPECT_EQ(r0.value(), Label{});
	for (const Label &want : {kPlain, full_label(), full_label(2000)}) {
		SCOPED_TRACE(want.blob.size());
		Records s(want);
		s.ml.ucnt = 3;
		const std::string unset = s.image();
		ASSERT_EQ(run(kSetPath, arg(file_, s)), 0);
		EXPECT_EQ(s.image(), unset) << "a set wrote to the caller's records";

		const std::array<uint32_t, 3> need{uint32_t(want.blob.size()), uint32_t(want.roles1.size()),
		                                   uint32_t(want.roles2.size())},
		    roomy{need[0] + 3, need[1] + 2, need[2] + 1};
		std::vector<std::array<uint32_t, 3>> offers{{0, 0, 0}, need, roomy};
		for (int dim = 0; dim < 3; ++dim)
			if (need[dim] != 0) {
				offers.push_back(roomy);
				offers.back()[dim] = need[dim] - 1;
			}
		for (const auto &room : offers) {
			SCOPED_TRACE(::testing::Message() << "room " << room[0] << "/" << room[1] << "/" << room[2]);
			Records r;
			r.offer(room[0], room[1], room[2]);
			const std::string before = r.image();
			const int err = run(kGetPath, arg(file_, r));
			if (room[0] >= need[0] && room[1] >= need[1] && room[2] >= need[2]) {
				ASSERT_EQ(err, 0);
				EXPECT_EQ(r.value(), want);
				EXPECT_EQ(std::count(r.blob.begin() + long(need[0]), r.blob.end(), kSentinel), long(room[0] - need[0]))
				    << "blob written past the label";
				continue;
			}
			ASSERT_EQ(err, E2BIG);
			EXPECT_EQ((std::array<uint32_t, 3>{r.ml.blob_size, r.rl.nroles1, r.rl.nroles2}), need);
			r.ml.blob_size = room[0], r.rl.nroles1 = room[1], r.rl.nroles2 = room[2];
			EXPECT_EQ(r.image(), before) << "more than the sizes written";
		}
	}
}

TEST_F(ServiceTest, FailuresCarryTheirOwnErrno)
{
	const std::string missing = dir_ / "missing";
	const int64_t gone = INT32_MAX; // above any pid_max: no such process
	set(kSetPath, file_, kBlob);
	Records r, no_ml, null_room;
	no_ml.l.ml = nullptr;
	null_room.ml.blob_size = 5; // room claimed, no buffer behind it: no E2BIG
	vyr_label_cmd_t null_path = arg(missing, r), no_label = arg(missing, r);
	null_path.target.path = nullptr;
	no_label.label = nullptr;
	const struct {
		const char *what;
		int cmd;
		vyr_label_cmd_t a;
		int err;
	} cases[] = {
	    {"get missing path", kGetPath, arg(missing, r), ENOENT},
	    {"get NULL path", kGetPath, null_path, EFAULT},
	    {"set NULL path", TAVREL_CMD_SET_LPATH, null_path, EFAULT},
	    {"get fd -1", TAVREL_CMD_GET_FD, arg(-1, r), EBADF},
	    {"set fd not open", TAVREL_CMD_SET_FD, arg(987654, r), EBADF},
	    {"fd beyond int", TAVREL_CMD_GET_FD, arg(int64_t{1} << 33, r), EBADF},
	    {"get no label", kGetPath, no_label, EFAULT},
	    {"get no ml", kGetPid, arg(kSelf, no_ml), EFAULT},
	    {"set no ml", kSetPid, arg(kSelf, no_ml), EFAULT},
	    {"room in a NULL buffer", kGetPath, arg(file_, null_room), EFAULT},
	    {"get pid gone", kGetPid, arg(gone, r), ESRCH},
	    {"set pid gone", kSetPid, arg(gone, r), ESRCH},
	    {"pid beyond int", kSetPid, arg(int64_t{1} << 40, r), ESRCH},
	    {"unknown command", 25, arg(missing, r), EINVAL},
	};
	for (const auto &c : cases)
		EXPECT_EQ(run(c.cmd, c.a), c.err) << c.what;
	errno = 0;
	EXPECT_EQ(tavrel_syscall_ioctl(kGetPath, nullptr), -1);
	EXPECT_EQ(errno, EFAULT);
}

// libvyr opens before every command and closes only in vyr_release: a
// second open must succeed, a bad setting or a closed channel must refuse.
TEST_F(ServiceTest, ChannelOpensOnlyOnAGoodConfiguration)
{
	Records r;
	EXPECT_EQ(tavrel_open(), 0);
	const std::pair<const char *, std::string> configs[] = {{"bogus", state_}, {"user", "rel/dir"}, {"user", state_}};
	for (const auto &[ns, dir] : configs) { // namespace, state directory
		tavrel_close();
		setenv("VYR_TAVREL_XATTR_NS", ns, 1);
		setenv("VYR_TAVREL_STATE_DIR", dir.c_str(), 1);
		errno = 0;
		const bool good = &dir == &configs[2].second;
		EXPECT_EQ(tavrel_open(), good ? 0 : -1) << ns << " " << dir;
		EXPECT_EQ(good ? EINVAL : errno, EINVAL) << ns << " " << dir;
		EXPECT_EQ(run(kGetPath, arg(file_, r)), good ? 0 : EBADF) << "a channel that failed to open stays closed";
	}
	EXPECT_EQ(tavrel_close(), 0);
	EXPECT_EQ(run(kGetPath, arg(file_, r)), EBADF);
}

// Only canonical role lists are stored, so that every label a get hands out
// is canonical; what a set refuses leaves the old label.  A corrupt store
// is an error that leaves the caller's records untouched.
TEST_F(ServiceTest, RefusedSetsAndCorruptStores)
{
	set(kSetPath, file_, kPlain);
	Label unordered = kRoles, duplicate = kRoles, huge = kPlain;
	unordered.roles1 = {{1, 0, 0}, {9, 0, 0}};
	duplicate.roles2 = {{4, 0, 0}, {4, 1, 1}};
	huge.blob.assign(tavrel::kMaxFormSize, 1);
	const struct {
		const char *what;
		const Label &label;
		void (*spoil)(Records &);
		int err;
	} cases[] = {
	    {"ascending roles1", unordered, nullptr, EINVAL},
	    {"duplicate ids in roles2", duplicate, nullptr, EINVAL},
	    {"form above the limit", huge, nullptr, ENOSPC},
	    {"blob_size without a blob", kBlob, [](Records &r) { r.ml.blob = nullptr; }, EFAULT},
	    {"nroles2 without roles2", kRoles, [](Records &r) { r.rl.roles2 = nullptr; }, EFAULT},
	};
	for (const auto &c : cases) {
		Records r(c.label);
		if (c.spoil)
			c.spoil(r);
		EXPECT_EQ(run(kSetPath, arg(file_, r)), c.err) << c.what;
	}
	EXPECT_EQ(get(kGetPath, file_), kPlain);

	std::vector<uint8_t> bytes = encode(kRoles);
	bytes[26] = 0; // first id of roles1: 9 -> 0, below the second
	ASSERT_EQ(setxattr(file_.c_str(), "user.vyrlabel", bytes.data(), bytes.size(), 0), 0);
	Records r;
	r.offer(100, 100, 100);
	const std::string before = r.image();
	EXPECT_EQ(run(kGetPath, arg(file_, r)), EIO);
	EXPECT_EQ(r.image(), before);
}

// One record per process, replaced whole (no temporary files stay), named
// "<pid>.<start time>": a record under another start time is an earlier
// process's that had our pid.
TEST_F(ServiceTest, OwnLabelByZeroOrByNumberInOneRecord)
{
	EXPECT_EQ(get(kGetPid, kSelf), Label{}); // no state directory yet
	set(kSetPid, kSelf, full_label());
	EXPECT_EQ(get(kGetPid, int64_t{getpid()}), full_label());
	set(kSetPid, int64_t{getpid()}, kBlob);
	EXPECT_EQ(get(kGetPid, kSelf), kBlob);
	std::vector<std::string> files; // temporary files included
	for (const auto &e : std::filesystem::directory_iterator(state_))
		files.push_back(e.path().filename());
	ASSERT_EQ(files.size(), 1u);
	std::ifstream stat("/proc/self/stat");
	const std::string line((std::istreambuf_iterator<char>(stat)), {});
	std::istringstream fields(line.substr(line.rfind(')') + 2)); // field 3 on; the start time is field 22
	std::string start;
	for (int field = 3; field <= 22; ++field)
		fields >> start;
	ASSERT_EQ(files[0], std::to_string(getpid()) + "." + start);
	const std::string rec = state_ + "/" + files[0];
	ASSERT_EQ(rename(rec.c_str(), (rec + "1").c_str()), 0);
	EXPECT_EQ(get(kGetPid, kSelf), Label{});
}

// Only labels larger than the inline buffer allocate.  A failed set stores
// nothing; a failed get leaves the records untouched.
TEST_F(ServiceTest, LargeLabelsSurviveAllocationFailure)
{
	const Label big = full_label(2000);
	for (bool by_pid : {false, true}) {
		SCOPED_TRACE(by_pid ? "process" : "file");
		const int set_cmd = by_pid ? kSetPid : kSetPath, get_cmd = by_pid ? kGetPid : kGetPath;
		auto target = [&](Records &r) { return by_pid ? arg(kSelf, r) : arg(file_, r); };
		Records old(kPlain);
		ASSERT_EQ(run(set_cmd, target(old)), 0);
		vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			Records r(big);
			const int err = inj.run([&] { return run(set_cmd, target(r)); });
			EXPECT_EQ(err, inj.fired() ? ENOMEM : 0);
			Label got;
			EXPECT_EQ(get_label(get_cmd, target(r), r, &got), 0);
			EXPECT_EQ(got, inj.fired() ? kPlain : big);
		});
		vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			Records r;
			r.offer(4000, 100, 100);
			const std::string before = r.image();
			const int err = inj.run([&] { return run(get_cmd, target(r)); });
			EXPECT_EQ(err, inj.fired() ? ENOMEM : 0);
			if (inj.fired())
				EXPECT_EQ(r.image(), before);
			else
				EXPECT_EQ(r.value(), big);
		});
	}
}

} // namespace
