// The label service stand-in, driven through its three exported functions
// exactly as libvyr drives it: the command protocol with its E2BIG exchange,
// each target kind, the stores behind them and their failure answers.
#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstring>
#include <dirent.h>
#include <fcntl.h>
#include <string>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

#include <gtest/gtest.h>

#include "contract/tavrel_base.h"
#include "label_codec.hh"
#include "support/failalloc.h"
#include "tavrel_test_util.hh"

namespace {

using namespace tavrel_test;

const Label kPlain{2, 1, 0x11, 4, {}, {}, {}};
const Label kBlob{3, 2, 0xff, 1, {0x41, 0x42, 0x43, 0x44, 0x45}, {}, {}};
const Label kRoles1{0, 7, 0, 0, {}, {{9, 1, 5}, {1, 2, 3}}, {}};
const Label kRoles2{1, 0, 1, 2, {}, {}, {{7, 0xdeadbeef, 0xff}}};

Label full_label()
{
	Label l{255, 254, ~uint64_t{0}, 0xffff, {}, {}, {}};
	for (int i = 0; i < 64; ++i)
		l.blob.push_back(static_cast<uint8_t>(i * 7));
	for (uint64_t id = 16; id > 0; --id)
		l.roles1.push_back({id << 40, static_cast<uint32_t>(id), static_cast<uint8_t>(id)});
	l.roles2 = {{~uint64_t{0}, 1, 0x80}, {5, 2, 1}, {0, 3, 2}};
	return l;
}

// A label whose stored form outgrows the service's inline buffer.
Label large_label()
{
	Label l = full_label();
	l.blob.assign(2000, 0x5a);
	return l;
}

bool has_variable_part(const Label &l)
{
	return !l.blob.empty() || !l.roles1.empty() || !l.roles2.empty();
}

// The stored form of a label, as the service writes it.
std::vector<uint8_t> encode(const Label &v)
{
	Records r;
	r.assign(v);
	std::vector<uint8_t> out(tavrel::encoded_size(&r.l));
	tavrel::encode_label(&r.l, out.data());
	return out;
}

std::string hex(const std::vector<uint8_t> &bytes)
{
	std::string s;
	char b[3];
	for (uint8_t x : bytes) {
		std::snprintf(b, sizeof b, "%02x", x);
		s += b;
	}
	return s;
}

// The mandatory fields of the records as raw bytes, to tell whether a
// failing command touched them.
struct Snapshot {
	std::vector<uint8_t> bytes;
	explicit Snapshot(const Records &r)
	{
		auto add = [this](const void *p, size_t n) {
			auto *b = static_cast<const uint8_t *>(p);
			bytes.insert(bytes.end(), b, b + n);
		};
		add(&r.ml, sizeof r.ml);
		add(&r.rl, sizeof r.rl);
		add(r.blob.data(), r.blob.size());
		add(r.r1.data(), r.r1.size() * sizeof(vyr_role_t));
		add(r.r2.data(), r.r2.size() * sizeof(vyr_role_t));
	}
	bool operator==(const Snapshot &) const = default;
};

class ServiceTest : public ::testing::Test {
protected:
	void SetUp() override
	{
		ASSERT_TRUE(dir_.ok());
		if (!supports_xattr(dir_.path(), "user", false))
			GTEST_SKIP() << dir_.path() << " keeps no user.* extended attributes; set TMPDIR to a "
			             << "directory on a file system that does";
		state_ = dir_ / "state";
		use_namespace("user");
	}
	void TearDown() override
	{
		tavrel_close();
		unsetenv("VYR_TAVREL_XATTR_NS");
		unsetenv("VYR_TAVREL_STATE_DIR");
	}

	// Reopens the channel on another attribute namespace.
	void use_namespace(const char *ns)
	{
		setenv("VYR_TAVREL_XATTR_NS", ns, 1);
		setenv("VYR_TAVREL_STATE_DIR", state_.c_str(), 1);
		tavrel_close();
		ASSERT_EQ(tavrel_open(), 0);
		attr_ = std::string(ns) + ".vyrlabel";
	}

	std::string make_file(const std::string &name)
	{
		const std::string p = dir_ / name;
		FILE *f = std::fopen(p.c_str(), "w");
		EXPECT_NE(f, nullptr);
		if (f)
			std::fclose(f);
		return p;
	}

	void set_path(const std::string &p, const Label &v, int cmd = TAVREL_CMD_SET_PATH)
	{
		Records r;
		r.assign(v);
		set_ok(cmd, path_arg(p, r));
	}

	Label get_path(const std::string &p, int cmd = TAVREL_CMD_GET_PATH)
	{
		Records r;
		Label out;
		EXPECT_EQ(get_label(cmd, path_arg(p, r), r, &out), 0) << p;
		return out;
	}

	Label get_pid(int64_t pid)
	{
		Records r;
		Label out;
		EXPECT_EQ(get_label(TAVREL_CMD_GET_PID, num_arg(pid, r), r, &out), 0) << "pid " << pid;
		return out;
	}

	void set_pid(int64_t pid, const Label &v)
	{
		Records r;
		r.assign(v);
		set_ok(TAVREL_CMD_SET_PID, num_arg(pid, r));
	}

	std::vector<std::string> state_files()
	{
		std::vector<std::string> names;
		if (DIR *d = opendir(state_.c_str())) {
			while (dirent *e = readdir(d))
				if (std::string(e->d_name) != "." && std::string(e->d_name) != "..")
					names.push_back(e->d_name);
			closedir(d);
		}
		std::sort(names.begin(), names.end());
		return names;
	}

	ScratchDir dir_;
	std::string state_;
	std::string attr_;
};

// ---- the E2BIG exchange -------------------------------------------------

struct ProtocolCase {
	const char *name;
	Label label;
};

class ProtocolTest : public ServiceTest, public ::testing::WithParamInterface<ProtocolCase> {};

TEST_P(ProtocolTest, EmptyOfferAnswersE2bigWithExactSizesOnlyWhenSomethingDoesNotFit)
{
	const Label &want = GetParam().label;
	const std::string f = make_file("f");
	set_path(f, want);

	Records r;
	const int err = run(TAVREL_CMD_GET_PATH, path_arg(f, r));
	if (!has_variable_part(want)) {
		ASSERT_EQ(err, 0);
		EXPECT_EQ(r.value(), want);
		EXPECT_EQ(r.ml.blob, nullptr);
		EXPECT_EQ(r.rl.roles1, nullptr);
		EXPECT_EQ(r.rl.roles2, nullptr);
		return;
	}
	ASSERT_EQ(err, E2BIG);
	EXPECT_EQ(r.ml.blob_size, want.blob.size());
	EXPECT_EQ(r.rl.nroles1, want.roles1.size());
	EXPECT_EQ(r.rl.nroles2, want.roles2.size());
	// Nothing but the sizes was written.
	EXPECT_EQ(r.ml.lev, Records::kSentinel);
	EXPECT_EQ(r.ml.ilev, Records::kSentinel);
	EXPECT_EQ(r.ml.type, 0xa5a5);
	EXPECT_EQ(r.ml.cat, 0xa5a5a5a5a5a5a5a5u);
	EXPECT_EQ(r.ml.blob, nullptr);
	EXPECT_EQ(r.rl.roles1, nullptr);
	EXPECT_EQ(r.rl.roles2, nullptr);
}

TEST_P(ProtocolTest, ExactRoomFillsEverythingInOneMorePass)
{
	const Label &want = GetParam().label;
	const std::string f = make_file("f");
	set_path(f, want);
	Records r;
	Label got;
	int passes = 0;
	ASSERT_EQ(get_label(TAVREL_CMD_GET_PATH, path_arg(f, r), r, &got, &passes), 0);
	EXPECT_EQ(got, want);
	EXPECT_EQ(passes, has_variable_part(want) ? 2 : 1);
}

TEST_P(ProtocolTest, RoomShortInAnyOneDimensionAnswersE2bigWithAllThreeSizes)
{
	const Label &want = GetParam().label;
	const std::string f = make_file("f");
	set_path(f, want);
	const uint32_t need[3] = {static_cast<uint32_t>(want.blob.size()), static_cast<uint32_t>(want.roles1.size()),
	                          static_cast<uint32_t>(want.roles2.size())};
	for (int dim = 0; dim < 3; ++dim) {
		if (need[dim] == 0)
			continue;
		uint32_t room[3] = {need[0] + 4, need[1] + 4, need[2] + 4};
		room[dim] = need[dim] - 1;
		Records r;
		r.offer(room[0], room[1], room[2]);
		const Snapshot before(r);
		ASSERT_EQ(run(TAVREL_CMD_GET_PATH, path_arg(f, r)), E2BIG) << "short in dimension " << dim;
		EXPECT_EQ(r.ml.blob_size, need[0]);
		EXPECT_EQ(r.rl.nroles1, need[1]);
		EXPECT_EQ(r.rl.nroles2, need[2]);
		// Put the offered sizes back: everything else must be as it was.
		r.ml.blob_size = room[0];
		r.rl.nroles1 = room[1];
		r.rl.nroles2 = room[2];
		EXPECT_TRUE(Snapshot(r) == before) << "dimension " << dim;
	}
}

TEST_P(ProtocolTest, LargerRoomFillsAndShrinksTheSizesLeavingTheRestOfTheBuffers)
{
	const Label &want = GetParam().label;
	const std::string f = make_file("f");
	set_path(f, want);
	Records r;
	r.offer(static_cast<uint32_t>(want.blob.size()) + 3, static_cast<uint32_t>(want.roles1.size()) + 2,
	        static_cast<uint32_t>(want.roles2.size()) + 1);
	ASSERT_EQ(run(TAVREL_CMD_GET_PATH, path_arg(f, r)), 0);
	EXPECT_EQ(r.value(), want);
	for (size_t i = want.blob.size(); i < r.blob.size(); ++i)
		EXPECT_EQ(r.blob[i], Records::kSentinel) << "blob byte " << i << " past the label";
}

INSTANTIATE_TEST_SUITE_P(Labels, ProtocolTest,
                         ::testing::Values(ProtocolCase{"plain", kPlain}, ProtocolCase{"blob", kBlob},
                                           ProtocolCase{"roles1", kRoles1}, ProtocolCase{"roles2", kRoles2},
                                           ProtocolCase{"full", full_label()}, ProtocolCase{"large", large_label()}),
                         [](const auto &info) { return std::string(info.param.name); });

TEST_F(ServiceTest, RoomOfferedInANullBufferIsAFaultNotE2big)
{
	const std::string f = make_file("f");
	set_path(f, kBlob);
	Records r;
	r.ml.blob_size = 5;  // room claimed, no buffer behind it
	const Snapshot before(r);
	EXPECT_EQ(run(TAVREL_CMD_GET_PATH, path_arg(f, r)), EFAULT);
	EXPECT_TRUE(Snapshot(r) == before);
}

TEST_F(ServiceTest, FileWithoutAttributeReadsAsTheZeroLabelInOnePass)
{
	const std::string f = make_file("f");
	Records r;
	Label got;
	int passes = 0;
	ASSERT_EQ(get_label(TAVREL_CMD_GET_PATH, path_arg(f, r), r, &got, &passes), 0);
	EXPECT_EQ(got, Label{});
	EXPECT_EQ(passes, 1);
}

// ---- failures other than E2BIG --------------------------------------------

TEST_F(ServiceTest, FailuresCarryTheirOwnErrno)
{
	const std::string missing = dir_ / "missing";
	Records r;
	vyr_label_cmd_t null_path{};
	null_path.label = &r.l;
	vyr_label_cmd_t no_label{};
	no_label.target.path = missing.c_str();
	Records no_ml;
	no_ml.l.ml = nullptr;

	struct Case {
		const char *what;
		int cmd;
		vyr_label_cmd_t arg;
		int err;
	} cases[] = {
	    {"get missing path", TAVREL_CMD_GET_PATH, path_arg(missing, r), ENOENT},
	    {"get missing link", TAVREL_CMD_GET_LPATH, path_arg(missing, r), ENOENT},
	    {"set missing path", TAVREL_CMD_SET_PATH, path_arg(missing, r), ENOENT},
	    {"get NULL path", TAVREL_CMD_GET_PATH, null_path, EFAULT},
	    {"set NULL path", TAVREL_CMD_SET_LPATH, null_path, EFAULT},
	    {"get fd -1", TAVREL_CMD_GET_FD, num_arg(-1, r), EBADF},
	    {"set fd not open", TAVREL_CMD_SET_FD, num_arg(987654, r), EBADF},
	    {"fd beyond int", TAVREL_CMD_GET_FD, num_arg(int64_t{1} << 33, r), EBADF},
	    {"get no label", TAVREL_CMD_GET_PATH, no_label, EFAULT},
	    {"set no label", TAVREL_CMD_SET_PATH, no_label, EFAULT},
	    {"get no ml", TAVREL_CMD_GET_PID, num_arg(0, no_ml), EFAULT},
	    {"set no ml", TAVREL_CMD_SET_PID, num_arg(0, no_ml), EFAULT},
	    {"unknown command", 25, path_arg(missing, r), EINVAL},
	    {"command 0", 0, path_arg(missing, r), EINVAL},
	};
	for (const Case &c : cases)
		EXPECT_EQ(run(c.cmd, c.arg), c.err) << c.what;
	errno = 0;
	EXPECT_EQ(tavrel_syscall_ioctl(TAVREL_CMD_GET_PATH, nullptr), -1);
	EXPECT_EQ(errno, EFAULT);
}

TEST_F(ServiceTest, ChannelMustBeOpenAndReopensCheaply)
{
	const std::string f = make_file("f");
	Records r;
	EXPECT_EQ(tavrel_open(), 0);  // again on an open channel
	EXPECT_EQ(run(TAVREL_CMD_GET_PATH, path_arg(f, r)), 0);
	EXPECT_EQ(tavrel_close(), 0);
	EXPECT_EQ(run(TAVREL_CMD_GET_PATH, path_arg(f, r)), EBADF);
	EXPECT_EQ(tavrel_open(), 0);
	EXPECT_EQ(run(TAVREL_CMD_GET_PATH, path_arg(f, r)), 0);
}

TEST_F(ServiceTest, OpenRefusesABadConfiguration)
{
	const struct {
		const char *ns;
		const char *dir;
		int err;
	} cases[] = {
	    {"bogus", "/tmp/x", EINVAL},
	    {"user.", "/tmp/x", EINVAL},
	    {"user", "relative/dir", EINVAL},
	};
	for (const auto &c : cases) {
		tavrel_close();
		setenv("VYR_TAVREL_XATTR_NS", c.ns, 1);
		setenv("VYR_TAVREL_STATE_DIR", c.dir, 1);
		errno = 0;
		EXPECT_LT(tavrel_open(), 0) << c.ns << " " << c.dir;
		EXPECT_EQ(errno, c.err) << c.ns << " " << c.dir;
		Records r;
		EXPECT_EQ(run(TAVREL_CMD_GET_PID, num_arg(0, r)), EBADF) << "channel stays closed";
	}
}

// ---- set commands ---------------------------------------------------------

TEST_F(ServiceTest, SetLeavesTheCallersRecordsAsTheyWere)
{
	const std::string f = make_file("f");
	Records r;
	r.assign(full_label());
	r.ml.ucnt = 3;
	r.rl.ucnt = 2;
	const Snapshot before(r);
	ASSERT_EQ(run(TAVREL_CMD_SET_PATH, path_arg(f, r)), 0);
	EXPECT_TRUE(Snapshot(r) == before);
	EXPECT_EQ(r.l.ucnt, 1);
	EXPECT_EQ(get_path(f), full_label());
}

TEST_F(ServiceTest, SetRefusesLabelsItCannotStoreAndKeepsTheOldOne)
{
	const std::string f = make_file("f");
	set_path(f, kPlain);

	Label unordered = kPlain;
	unordered.roles1 = {{1, 0, 0}, {9, 0, 0}};
	Label duplicate = kPlain;
	duplicate.roles2 = {{4, 0, 0}, {4, 1, 1}};
	Label huge = kPlain;
	huge.blob.assign(tavrel::kMaxFormSize, 1);

	const struct {
		const char *what;
		Label label;
		int err;
	} cases[] = {
	    {"ascending roles1", unordered, EINVAL},
	    {"duplicate ids in roles2", duplicate, EINVAL},
	    {"form above the limit", huge, ENOSPC},
	};
	for (const auto &c : cases) {
		Records r;
		r.assign(c.label);
		EXPECT_EQ(run(TAVREL_CMD_SET_PATH, path_arg(f, r)), c.err) << c.what;
	}
	Records r;
	r.assign(kBlob);
	r.ml.blob = nullptr;
	EXPECT_EQ(run(TAVREL_CMD_SET_PATH, path_arg(f, r)), EFAULT) << "blob_size without a blob";
	r.assign(kRoles1);
	r.rl.roles1 = nullptr;
	EXPECT_EQ(run(TAVREL_CMD_SET_PATH, path_arg(f, r)), EFAULT) << "nroles1 without roles1";

	EXPECT_EQ(get_path(f), kPlain);
}

// ---- corrupt stores -------------------------------------------------------

struct Corruption {
	const char *name;
	std::vector<uint8_t> bytes;
	int err;
};

std::vector<uint8_t> with(std::vector<uint8_t> b, size_t off, std::initializer_list<uint8_t> patch)
{
	for (uint8_t x : patch)
		b.at(off++) = x;
	return b;
}

std::vector<Corruption> corruptions()
{
	const std::vector<uint8_t> plain = encode(kPlain), blob = encode(kBlob), roles = encode(kRoles1);
	std::vector<uint8_t> longer = blob;
	longer.push_back(0);
	return {
	    {"empty", {}, EIO},
	    {"head cut short", std::vector<uint8_t>(plain.begin(), plain.end() - 1), EIO},
	    {"version 2", with(plain, 0, {2, 0}), EINVAL},
	    {"version bytes swapped", with(plain, 0, {0, 1}), EINVAL},
	    {"blob cut short", std::vector<uint8_t>(blob.begin(), blob.end() - 1), EIO},
	    {"trailing byte", longer, EIO},
	    {"role entry cut short", std::vector<uint8_t>(roles.begin(), roles.end() - 1), EIO},
	    {"counts beyond the bytes", with(plain, 18, {0xff, 0xff, 0xff, 0xff}), EIO},
	    {"roles out of order", with(roles, 26, {0}), EIO},  // first id 9 -> 0, below the second (1)
	    {"duplicate role ids", with(roles, 26, {1}), EIO},
	};
}

class CorruptionTest : public ServiceTest, public ::testing::WithParamInterface<Corruption> {};

TEST_P(CorruptionTest, FileAttributeIsAnErrorAndTheRecordsStayUntouched)
{
	const std::string f = make_file("f");
	const auto &bytes = GetParam().bytes;
	ASSERT_EQ(setxattr(f.c_str(), attr_.c_str(), bytes.data(), bytes.size(), 0), 0);
	for (uint32_t room : {0u, 100u}) {
		Records r;
		r.offer(room, room, room);
		const Snapshot before(r);
		EXPECT_EQ(run(TAVREL_CMD_GET_PATH, path_arg(f, r)), GetParam().err) << "room " << room;
		EXPECT_TRUE(Snapshot(r) == before) << "room " << room;
	}
}

TEST_P(CorruptionTest, ProcessRecordIsAnErrorAndTheRecordsStayUntouched)
{
	set_pid(0, kRoles2);
	const auto files = state_files();
	ASSERT_EQ(files.size(), 1u);
	const std::string rec = state_ + "/" + files[0];
	FILE *fp = std::fopen(rec.c_str(), "w");
	ASSERT_NE(fp, nullptr);
	const auto &bytes = GetParam().bytes;
	if (!bytes.empty()) {
		ASSERT_EQ(std::fwrite(bytes.data(), 1, bytes.size(), fp), bytes.size());
	}
	std::fclose(fp);
	Records r;
	r.offer(100, 100, 100);
	const Snapshot before(r);
	EXPECT_EQ(run(TAVREL_CMD_GET_PID, num_arg(0, r)), GetParam().err);
	EXPECT_TRUE(Snapshot(r) == before);
}

INSTANTIATE_TEST_SUITE_P(Forms, CorruptionTest, ::testing::ValuesIn(corruptions()), [](const auto &info) {
	std::string n = info.param.name;
	std::replace(n.begin(), n.end(), ' ', '_');
	return n;
});

// ---- paths, links and descriptors -----------------------------------------

TEST_F(ServiceTest, PathCommandsFollowALinkToTheFile)
{
	const std::string f = make_file("f");
	const std::string link = dir_ / "link";
	ASSERT_EQ(symlink("f", link.c_str()), 0);
	set_path(link, kBlob);
	EXPECT_EQ(get_path(f), kBlob);
	EXPECT_EQ(get_path(link), kBlob);
	// The link itself carries nothing (user.* attributes can't be on links).
	EXPECT_EQ(get_path(link, TAVREL_CMD_GET_LPATH), Label{});
}

TEST_F(ServiceTest, LinkCommandsActOnTheLinkItself)
{
	if (!supports_xattr(dir_.path(), "trusted", true))
		GTEST_SKIP() << "labels on symbolic links need trusted.* attributes, which this process may not set";
	use_namespace("trusted");
	const std::string f = make_file("f");
	const std::string link = dir_ / "link";
	ASSERT_EQ(symlink("f", link.c_str()), 0);
	set_path(f, kPlain);
	set_path(link, kRoles1, TAVREL_CMD_SET_LPATH);
	EXPECT_EQ(get_path(link, TAVREL_CMD_GET_LPATH), kRoles1);
	EXPECT_EQ(get_path(link), kPlain);
	EXPECT_EQ(get_path(f), kPlain);
	// A link command on a plain file is the same as a path command.
	set_path(f, kBlob, TAVREL_CMD_SET_LPATH);
	EXPECT_EQ(get_path(f), kBlob);
}

TEST_F(ServiceTest, DescriptorsReachTheFileTheyOpened)
{
	const std::string f = make_file("f");
	const int fd = open(f.c_str(), O_RDONLY | O_CLOEXEC);
	ASSERT_GE(fd, 0);
	Records r;
	r.assign(kRoles2);
	set_ok(TAVREL_CMD_SET_FD, num_arg(fd, r));
	EXPECT_EQ(get_path(f), kRoles2);
	Label got;
	EXPECT_EQ(get_label(TAVREL_CMD_GET_FD, num_arg(fd, r), r, &got), 0);
	EXPECT_EQ(got, kRoles2);
	close(fd);

	// A descriptor that only names the file (O_PATH) works too.
	const int pfd = open(f.c_str(), O_PATH | O_CLOEXEC);
	ASSERT_GE(pfd, 0);
	EXPECT_EQ(get_label(TAVREL_CMD_GET_FD, num_arg(pfd, r), r, &got), 0);
	EXPECT_EQ(got, kRoles2);
	r.assign(kPlain);
	set_ok(TAVREL_CMD_SET_FD, num_arg(pfd, r));
	close(pfd);
	EXPECT_EQ(get_path(f), kPlain);
}

TEST_F(ServiceTest, LabelMovesWithTheFile)
{
	const std::string f = make_file("f");
	set_path(f, full_label());
	const std::string moved = dir_ / "moved";
	ASSERT_EQ(rename(f.c_str(), moved.c_str()), 0);
	EXPECT_EQ(get_path(moved), full_label());
	EXPECT_EQ(get_path(make_file("f")), Label{});  // a new file at the old name has none
}

// ---- processes ------------------------------------------------------------

// Runs fn in a child process; its result (true = passed) is the exit status.
template <class F>
bool in_child(F &&fn)
{
	const pid_t pid = fork();
	if (pid == 0)
		_exit(fn() ? 0 : 1);
	int status = 0;
	waitpid(pid, &status, 0);
	return WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

// The label of a process in a child, without gtest (not fork-safe).
bool child_label_is(int64_t pid, const Label &want)
{
	Records r;
	Label got;
	return get_label(TAVREL_CMD_GET_PID, num_arg(pid, r), r, &got) == 0 && got == want;
}

TEST_F(ServiceTest, ProcessWithoutAnyRecordHasTheZeroLabel)
{
	EXPECT_EQ(get_pid(0), Label{});
	EXPECT_EQ(get_pid(getpid()), Label{});
}

TEST_F(ServiceTest, OwnLabelByZeroOrByNumber)
{
	set_pid(0, full_label());
	EXPECT_EQ(get_pid(getpid()), full_label());
	set_pid(getpid(), kBlob);
	EXPECT_EQ(get_pid(0), kBlob);
	// One record per process, replaced whole: no temporary files stay behind.
	EXPECT_EQ(state_files().size(), 1u);
}

TEST_F(ServiceTest, ChildrenTakeTheNearestLabelledAncestors)
{
	set_pid(0, kPlain);
	const bool ok = in_child([] {
		if (!child_label_is(0, kPlain))
			return false;  // inherited from the parent
		Records r;
		r.assign(kBlob);
		if (run(TAVREL_CMD_SET_PID, num_arg(0, r)) != 0)
			return false;
		// The grandchild has no record: its parent's label is nearer.
		return in_child([] { return child_label_is(0, kBlob); });
	});
	EXPECT_TRUE(ok);
	EXPECT_EQ(get_pid(0), kPlain);  // the child's change stayed its own
}

TEST_F(ServiceTest, LabelOfAnotherLiveProcess)
{
	int go[2];
	ASSERT_EQ(pipe(go), 0);
	const pid_t child = fork();
	if (child == 0) {
		char c;
		close(go[1]);
		(void)!read(go[0], &c, 1);
		_exit(child_label_is(0, kRoles1) ? 0 : 1);
	}
	close(go[0]);
	set_pid(child, kRoles1);
	EXPECT_EQ(get_pid(child), kRoles1);
	EXPECT_EQ(get_pid(0), Label{});
	(void)!write(go[1], "x", 1);
	close(go[1]);
	int status = 0;
	waitpid(child, &status, 0);
	EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << "child saw another label";
}

TEST_F(ServiceTest, NoSuchProcessIsEsrch)
{
	const pid_t gone = fork();
	if (gone == 0)
		_exit(0);
	waitpid(gone, nullptr, 0);
	for (int64_t pid : {int64_t{gone}, int64_t{-5}, int64_t{INT_MAX}, int64_t{1} << 40}) {
		Records r;
		r.assign(kPlain);
		EXPECT_EQ(run(TAVREL_CMD_SET_PID, num_arg(pid, r)), ESRCH) << pid;
		EXPECT_EQ(run(TAVREL_CMD_GET_PID, num_arg(pid, r)), ESRCH) << pid;
	}
}

// Field 22 of /proc/self/stat: the start time that keys the records.
std::string own_start_time()
{
	FILE *f = std::fopen("/proc/self/stat", "r");
	if (!f)
		return {};
	char line[1024] = {};
	(void)!std::fgets(line, sizeof line, f);
	std::fclose(f);
	const char *p = std::strrchr(line, ')');
	for (int field = 2; p && field < 22; ++field)
		p = std::strchr(p + 1, ' ');
	return p ? std::string(p + 1, std::strcspn(p + 1, " ")) : std::string();
}

TEST_F(ServiceTest, RecordOfAnEarlierProcessWithTheSamePidIsNotInherited)
{
	set_pid(0, kBlob);
	auto files = state_files();
	ASSERT_EQ(files.size(), 1u);
	const std::string start = own_start_time();
	ASSERT_FALSE(start.empty());
	EXPECT_EQ(files[0], std::to_string(getpid()) + "." + start);
	// Key the record with another start time: as if an earlier process that
	// had this pid had left it.
	const std::string rec = state_ + "/" + files[0];
	ASSERT_EQ(rename(rec.c_str(), (rec + "1").c_str()), 0);
	EXPECT_EQ(get_pid(0), Label{});
}

TEST_F(ServiceTest, StateDirectoryIsCreatedOnDemand)
{
	state_ = dir_ / "deeper/still/state";
	use_namespace("user");
	EXPECT_EQ(get_pid(0), Label{});
	set_pid(0, kRoles2);
	EXPECT_EQ(get_pid(0), kRoles2);
	EXPECT_EQ(state_files().size(), 1u);
}

// ---- other processes see the same store -----------------------------------

std::string probe(const std::string &args, int *status)
{
	const std::string cmd = std::string(TAVREL_PROBE) + " " + args;
	FILE *p = popen(cmd.c_str(), "r");
	if (!p)
		return {};
	std::string out;
	char buf[4096];
	while (size_t n = std::fread(buf, 1, sizeof buf, p))
		out.append(buf, n);
	*status = pclose(p);
	while (!out.empty() && out.back() == '\n')
		out.pop_back();
	return out;
}

TEST_F(ServiceTest, AnotherProcessReadsAndSetsTheSameLabels)
{
	const std::string f = make_file("f");
	set_path(f, full_label());
	int status = -1;
	EXPECT_EQ(probe("get path " + f, &status), hex(encode(full_label())));
	EXPECT_EQ(status, 0);
	EXPECT_EQ(probe("get fd " + f, &status), hex(encode(full_label())));

	EXPECT_EQ(probe("set path " + f + " " + hex(encode(kRoles1)), &status), "");
	EXPECT_EQ(status, 0);
	EXPECT_EQ(get_path(f), kRoles1);

	// The probe, a descendant without a record, inherits this process's label.
	set_pid(0, kBlob);
	EXPECT_EQ(probe("get pid 0", &status), hex(encode(kBlob)));
	EXPECT_EQ(probe("get pid " + std::to_string(getpid()), &status), hex(encode(kBlob)));
}

// ---- allocation failure ---------------------------------------------------

TEST_F(ServiceTest, LargeLabelsSurviveAllocationFailure)
{
	const std::string f = make_file("f");
	set_pid(0, kPlain);
	set_path(f, kPlain);
	const Label big = large_label();
	for (int cmd : {TAVREL_CMD_SET_PATH, TAVREL_CMD_SET_PID}) {
		vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			Records r;
			r.assign(big);
			auto arg = cmd == TAVREL_CMD_SET_PATH ? path_arg(f, r) : num_arg(0, r);
			const int err = inj.run([&] { return run(cmd, arg); });
			if (inj.fired()) {
				EXPECT_EQ(err, ENOMEM);
				// Nothing was stored: the old label stands.
				EXPECT_EQ(cmd == TAVREL_CMD_SET_PATH ? get_path(f) : get_pid(0), kPlain);
			} else {
				EXPECT_EQ(err, 0);
			}
		});
	}
	for (int cmd : {TAVREL_CMD_GET_PATH, TAVREL_CMD_GET_PID}) {
		vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			Records r;
			r.offer(4000, 100, 100);
			const Snapshot before(r);
			auto arg = cmd == TAVREL_CMD_GET_PATH ? path_arg(f, r) : num_arg(0, r);
			const int err = inj.run([&] { return run(cmd, arg); });
			if (inj.fired()) {
				EXPECT_EQ(err, ENOMEM);
				EXPECT_TRUE(Snapshot(r) == before);
			} else {
				EXPECT_EQ(err, 0);
				EXPECT_EQ(r.value(), big);
			}
		});
	}
}

} // namespace
