// The label service stand-in, driven through its three exported functions
// exactly as libvyr drives it: the command protocol with its E2BIG exchange,
// each target kind, the stores behind them and their failure answers.
#include <array>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <string>
#include <sys/wait.h>
#include <type_traits>
#include <unistd.h>
#include <vector>

#include <gtest/gtest.h>

#include "support/failalloc.h"
#include "support/scratch_dir.hh"
#include "tavrel_test_util.hh"

namespace {

using namespace tavrel_test;

const Label kPlain{2, 1, 0x11, 4, {}, {}, {}};
const Label kBlob{3, 2, 0xff, 1, {0x41, 0x42, 0x43, 0x44, 0x45}, {}, {}};
const Label kRoles{0, 7, 0, 0, {}, {{9, 1, 5}, {1, 2, 3}}, {{7, 0xdeadbeef, 0xff}}};

// Every field at its extremes and all three variable parts.  A blob of 2000
// bytes makes the stored form outgrow the service's inline buffer.
Label full_label(size_t blob_bytes = 64)
{
	Label l{255, 254, ~uint64_t{0}, 0xffff, {}, {}, {}};
	for (size_t i = 0; i < blob_bytes; ++i)
		l.blob.push_back(static_cast<uint8_t>(i * 7));
	for (uint64_t id = 16; id > 0; --id)
		l.roles1.push_back({id << 40, static_cast<uint32_t>(id), static_cast<uint8_t>(id)});
	l.roles2 = {{~uint64_t{0}, 1, 0x80}, {5, 2, 1}, {0, 3, 2}};
	return l;
}

// Every field of the records and every byte of their buffers, to tell
// whether a command wrote anything it should not have.  Field by field: the
// padding between fields holds no value and is never initialised.
struct Snapshot {
	std::vector<uint64_t> values;
	explicit Snapshot(const Records &r)
	{
		auto add = [this](auto... v) { (values.push_back(as_value(v)), ...); };
		add(r.l.ml, r.l.rl, r.l.ucnt);
		add(r.ml.lev, r.ml.ilev, r.ml.cat, r.ml.type, r.ml.blob_size, r.ml.blob, r.ml.ucnt);
		add(r.rl.nroles1, r.rl.nroles2, r.rl.roles1, r.rl.roles2, r.rl.ucnt);
		for (uint8_t b : r.blob)
			add(b);
		for (const auto *roles : {&r.r1, &r.r2})
			for (const vyr_role_t &role : *roles)
				add(role.id, role.attr, role.rights);
	}
	bool operator==(const Snapshot &) const = default;

private:
	template <class T> static uint64_t as_value(T v)
	{
		if constexpr (std::is_pointer_v<T>)
			return reinterpret_cast<uintptr_t>(v);
		else
			return static_cast<uint64_t>(v);
	}
};

// Waits for a forked child; true when it exited with 0.  (Children report
// through their exit status: gtest assertions are not theirs to make.)
bool exited_ok(pid_t pid)
{
	int status = 0;
	return waitpid(pid, &status, 0) == pid && WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

bool label_is(int cmd, vyr_label_cmd_t a, Records &r, const Label &want)
{
	Label got;
	return get_label(cmd, a, r, &got) == 0 && got == want;
}

class ServiceTest : public ::testing::Test {
protected:
	void SetUp() override
	{
		ASSERT_TRUE(dir_.ok());
		if (!supports_xattr(dir_.path(), "user", false))
			GTEST_SKIP() << dir_.path() << " keeps no user.* extended attributes; set TMPDIR to a "
			             << "directory on a file system that does";
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
		std::ofstream(dir_ / name).flush();
		return dir_ / name;
	}

	template <class Target>
	void set(int cmd, const Target &t, const Label &v)
	{
		Records r;
		r.assign(v);
		ASSERT_EQ(run(cmd, arg(t, r)), 0) << v;
	}

	template <class Target>
	Label get(int cmd, const Target &t)
	{
		Records r;
		Label out;
		EXPECT_EQ(get_label(cmd, arg(t, r), r, &out), 0);
		return out;
	}

	vyr_test::ScratchDir dir_;
	// Not made here: the service creates it, parents included, on first use.
	std::string state_ = dir_ / "run/tavrel";
	std::string attr_;
};

constexpr int kGetPath = TAVREL_CMD_GET_PATH, kSetPath = TAVREL_CMD_SET_PATH;
constexpr int kGetPid = TAVREL_CMD_GET_PID, kSetPid = TAVREL_CMD_SET_PID;
constexpr int64_t kSelf = 0;

// ---- the E2BIG exchange -------------------------------------------------

// libvyr's retry loop ends only when the service stops answering E2BIG, and
// allocates exactly the sizes it was told: they must be exact, and a short
// offer must leave every other byte of the records alone.
TEST_F(ServiceTest, GetAnswersE2bigWithTheSizesNeededUntilTheRoomSuffices)
{
	int n = 0;
	for (const Label &want : {kPlain, full_label(), full_label(2000)}) {
		SCOPED_TRACE(::testing::Message() << want);
		const std::string f = make_file("f" + std::to_string(n++));
		// A file without a label reads as the zero label, with no room offered.
		Records r0;
		ASSERT_EQ(run(kGetPath, arg(f, r0)), 0);
		EXPECT_EQ(r0.value(), Label{});

		// The caller's records, use counts included, are only read by a set.
		Records s;
		s.assign(want);
		s.ml.ucnt = 3;
		const Snapshot unset(s);
		ASSERT_EQ(run(kSetPath, arg(f, s)), 0);
		EXPECT_TRUE(Snapshot(s) == unset) << "set wrote to the caller's records";

		const std::array<uint32_t, 3> need{static_cast<uint32_t>(want.blob.size()),
		                                   static_cast<uint32_t>(want.roles1.size()),
		                                   static_cast<uint32_t>(want.roles2.size())};
		const std::array<uint32_t, 3> roomy{need[0] + 3, need[1] + 2, need[2] + 1};
		// Exactly the room asked for must be enough, or libvyr never gets out.
		std::vector<std::array<uint32_t, 3>> offers{{0, 0, 0}, need, roomy};
		for (int dim = 0; dim < 3; ++dim) {
			if (need[dim] == 0)
				continue;
			auto short_one = roomy;
			short_one[dim] = need[dim] - 1;
			offers.push_back(short_one);
		}
		for (const auto &room : offers) {
			SCOPED_TRACE(::testing::Message() << "room " << room[0] << "/" << room[1] << "/" << room[2]);
			Records r;
			r.offer(room[0], room[1], room[2]);
			const Snapshot before(r);
			const bool fits = room[0] >= need[0] && room[1] >= need[1] && room[2] >= need[2];
			const int err = run(kGetPath, arg(f, r));
			if (fits) {
				ASSERT_EQ(err, 0);
				EXPECT_EQ(r.value(), want);
				for (size_t i = want.blob.size(); i < r.blob.size(); ++i)
					EXPECT_EQ(r.blob[i], Records::kSentinel) << "blob byte " << i << " past the label";
				continue;
			}
			ASSERT_EQ(err, E2BIG);
			EXPECT_EQ((std::array<uint32_t, 3>{r.ml.blob_size, r.rl.nroles1, r.rl.nroles2}), need);
			r.ml.blob_size = room[0];
			r.rl.nroles1 = room[1];
			r.rl.nroles2 = room[2];
			EXPECT_TRUE(Snapshot(r) == before) << "more than the sizes written";
		}
	}
}

// ---- failures other than E2BIG --------------------------------------------

TEST_F(ServiceTest, FailuresCarryTheirOwnErrno)
{
	const std::string missing = dir_ / "missing", blob = make_file("blob");
	const pid_t gone = fork();
	if (gone == 0)
		_exit(0);
	waitpid(gone, nullptr, 0);
	set(kSetPath, blob, kBlob);
	Records r, no_ml, null_room;
	no_ml.l.ml = nullptr;
	null_room.ml.blob_size = 5;  // room claimed, no buffer behind it: no E2BIG
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
	    {"get missing link", TAVREL_CMD_GET_LPATH, arg(missing, r), ENOENT},
	    {"set missing path", kSetPath, arg(missing, r), ENOENT},
	    {"get NULL path", kGetPath, null_path, EFAULT},
	    {"set NULL path", TAVREL_CMD_SET_LPATH, null_path, EFAULT},
	    {"get fd -1", TAVREL_CMD_GET_FD, arg(-1, r), EBADF},
	    {"set fd not open", TAVREL_CMD_SET_FD, arg(987654, r), EBADF},
	    {"fd beyond int", TAVREL_CMD_GET_FD, arg(int64_t{1} << 33, r), EBADF},
	    {"get no label", kGetPath, no_label, EFAULT},
	    {"set no label", kSetPath, no_label, EFAULT},
	    {"get no ml", kGetPid, arg(kSelf, no_ml), EFAULT},
	    {"set no ml", kSetPid, arg(kSelf, no_ml), EFAULT},
	    {"room in a NULL buffer", kGetPath, arg(blob, null_room), EFAULT},
	    {"get pid gone", kGetPid, arg(int64_t{gone}, r), ESRCH},
	    {"set pid gone", kSetPid, arg(int64_t{gone}, r), ESRCH},
	    {"pid negative", kGetPid, arg(-5, r), ESRCH},
	    {"pid beyond int", kSetPid, arg(int64_t{1} << 40, r), ESRCH},
	    {"unknown command", 25, arg(missing, r), EINVAL},
	};
	for (const auto &c : cases)
		EXPECT_EQ(run(c.cmd, c.a), c.err) << c.what;
	errno = 0;
	EXPECT_EQ(tavrel_syscall_ioctl(kGetPath, nullptr), -1);
	EXPECT_EQ(errno, EFAULT);
}

// libvyr opens before every command and never closes but in vyr_release:
// a second open must succeed, and a closed channel must refuse commands.
TEST_F(ServiceTest, ChannelOpensOnlyOnAGoodConfiguration)
{
	const std::string f = make_file("f");
	Records r;
	const struct {
		const char *ns, *dir;
	} bad[] = {{"bogus", "/tmp/x"}, {"user", "relative/dir"}};
	for (const auto &c : bad) {
		tavrel_close();
		setenv("VYR_TAVREL_XATTR_NS", c.ns, 1);
		setenv("VYR_TAVREL_STATE_DIR", c.dir, 1);
		errno = 0;
		EXPECT_LT(tavrel_open(), 0) << c.ns << " " << c.dir;
		EXPECT_EQ(errno, EINVAL) << c.ns << " " << c.dir;
		EXPECT_EQ(run(kGetPath, arg(f, r)), EBADF) << "channel stays closed";
	}
	use_namespace("user");
	EXPECT_EQ(tavrel_open(), 0);
	EXPECT_EQ(run(kGetPath, arg(f, r)), 0);
	EXPECT_EQ(tavrel_close(), 0);
	EXPECT_EQ(run(kGetPath, arg(f, r)), EBADF);
}

// ---- set commands ---------------------------------------------------------

// The service stores only canonical role lists, so that every label a get
// command hands out is canonical; what it refuses leaves the old label.
TEST_F(ServiceTest, SetRefusesLabelsItCannotStoreAndKeepsTheOldOne)
{
	const std::string f = make_file("f");
	set(kSetPath, f, kPlain);
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
		Records r;
		r.assign(c.label);
		if (c.spoil)
			c.spoil(r);
		EXPECT_EQ(run(kSetPath, arg(f, r)), c.err) << c.what;
	}
	EXPECT_EQ(get(kGetPath, f), kPlain);
}

// ---- corrupt stores -------------------------------------------------------

// A get command decodes the whole stored form before it fills anything: a
// corrupt store is an error and leaves the caller's records untouched, even
// with room for everything.  (The decoder's refusals are in the codec test.)
TEST_F(ServiceTest, CorruptStoreIsAnErrorAndTheRecordsStayUntouched)
{
	std::vector<uint8_t> bytes = encode(kRoles);
	bytes[26] = 0;  // first id of roles1: 9 -> 0, below the second
	const std::string f = make_file("f");
	ASSERT_EQ(setxattr(f.c_str(), attr_.c_str(), bytes.data(), bytes.size(), 0), 0);
	Records r;
	r.offer(100, 100, 100);
	const Snapshot before(r);
	EXPECT_EQ(run(kGetPath, arg(f, r)), EIO);
	EXPECT_TRUE(Snapshot(r) == before);
}

// ---- paths, links and descriptors -----------------------------------------

// Path commands follow a final symbolic link, link commands act on the link
// itself (and on a plain file like path commands).
TEST_F(ServiceTest, PathCommandsFollowLinksAndLinkCommandsDoNot)
{
	const std::string f = make_file("f"), link = dir_ / "link";
	ASSERT_EQ(symlink("f", link.c_str()), 0);
	set(kSetPath, link, kBlob);
	EXPECT_EQ(get(kGetPath, f), kBlob);
	EXPECT_EQ(get(TAVREL_CMD_GET_LPATH, link), Label{});  // user.* attributes never sit on links
	if (!supports_xattr(dir_.path(), "trusted", true))
		GTEST_SKIP() << "labels on symbolic links need trusted.* attributes, which this process may not set";
	use_namespace("trusted");
	set(kSetPath, f, kPlain);
	set(TAVREL_CMD_SET_LPATH, link, kRoles);
	EXPECT_EQ(get(TAVREL_CMD_GET_LPATH, link), kRoles);
	EXPECT_EQ(get(kGetPath, link), kPlain);
	set(TAVREL_CMD_SET_LPATH, f, kBlob);
	EXPECT_EQ(get(kGetPath, f), kBlob);
}

TEST_F(ServiceTest, DescriptorsReachTheFileTheyOpened)
{
	const std::string f = make_file("f");
	// O_PATH descriptors are refused by the f*xattr calls: the service must
	// reach their file another way.
	for (int flags : {O_RDONLY, O_PATH}) {
		const int fd = open(f.c_str(), flags | O_CLOEXEC);
		ASSERT_GE(fd, 0);
		const Label &v = flags == O_PATH ? kRoles : kBlob;
		set(TAVREL_CMD_SET_FD, int64_t{fd}, v);
		EXPECT_EQ(get(kGetPath, f), v);
		EXPECT_EQ(get(TAVREL_CMD_GET_FD, int64_t{fd}), v);
		close(fd);
	}
}

// ---- processes ------------------------------------------------------------

TEST_F(ServiceTest, OwnLabelByZeroOrByNumberInOneRecord)
{
	EXPECT_EQ(get(kGetPid, kSelf), Label{});  // no state directory yet: no records at all
	set(kSetPid, kSelf, full_label());
	EXPECT_EQ(get(kGetPid, int64_t{getpid()}), full_label());
	set(kSetPid, int64_t{getpid()}, kBlob);
	EXPECT_EQ(get(kGetPid, kSelf), kBlob);
	// One record, replaced whole (no temporary files stay behind), keyed by
	// pid and start time.
	std::vector<std::string> files;  // temporary files included
	for (const auto &e : std::filesystem::directory_iterator(state_))
		files.push_back(e.path().filename());
	ASSERT_EQ(files.size(), 1u);
	const std::string prefix = std::to_string(getpid()) + ".";
	ASSERT_EQ(files[0].rfind(prefix, 0), 0u) << files[0];
	ASSERT_GT(files[0].size(), prefix.size()) << "no start time in the key";
	// Under another start time the record is an earlier process's that had
	// the same pid: it must not be taken for ours.
	const std::string rec = state_ + "/" + files[0];
	ASSERT_EQ(rename(rec.c_str(), (rec + "1").c_str()), 0);
	EXPECT_EQ(get(kGetPid, kSelf), Label{});
}

// Labels live in the stores, not in the memory of the process that set
// them; and a process without a record of its own has the label of its
// nearest ancestor that has one, as if copied at fork.
TEST_F(ServiceTest, ProcessesShareTheStoresAndInheritFromTheNearestAncestor)
{
	int go[2];
	ASSERT_EQ(pipe(go), 0);
	const std::string f = make_file("f");
	set(kSetPath, f, full_label());
	set(kSetPid, kSelf, kPlain);
	const pid_t child = fork();
	if (child == 0) {
		char c;
		close(go[1]);
		(void)!read(go[0], &c, 1);
		tavrel_close();  // start from the environment, as a new program would
		Records r;
		bool ok = tavrel_open() == 0 && label_is(kGetPid, arg(kSelf, r), r, kRoles) &&
		          label_is(kGetPath, arg(f, r), r, full_label());
		// The grandchild has no record: its parent's label is nearer than ours.
		const pid_t grandchild = fork();
		if (grandchild == 0)
			_exit(label_is(kGetPid, arg(kSelf, r), r, kRoles) ? 0 : 1);
		ok = exited_ok(grandchild) && ok;
		r.assign(kBlob);
		_exit(ok && run(kSetPath, arg(f, r)) == 0 ? 0 : 1);
	}
	close(go[0]);
	EXPECT_EQ(get(kGetPid, int64_t{child}), kPlain);  // no record yet: the parent's
	set(kSetPid, int64_t{child}, kRoles);
	EXPECT_EQ(get(kGetPid, int64_t{child}), kRoles);
	(void)!write(go[1], "x", 1);
	close(go[1]);
	EXPECT_TRUE(exited_ok(child)) << "child saw other labels";
	EXPECT_EQ(get(kGetPid, kSelf), kPlain);  // the child's record stays its own
	EXPECT_EQ(get(kGetPath, f), kBlob);
}

// ---- allocation failure ---------------------------------------------------

// Only labels larger than the inline buffer allocate.  A failed set stores
// nothing; a failed get leaves the records untouched.
TEST_F(ServiceTest, LargeLabelsSurviveAllocationFailure)
{
	const std::string f = make_file("f");
	const Label big = full_label(2000);
	for (bool by_pid : {false, true}) {
		SCOPED_TRACE(by_pid ? "process" : "file");
		const int set_cmd = by_pid ? kSetPid : kSetPath, get_cmd = by_pid ? kGetPid : kGetPath;
		auto target = [&](Records &r) { return by_pid ? arg(kSelf, r) : arg(f, r); };
		Records old;
		old.assign(kPlain);
		ASSERT_EQ(run(set_cmd, target(old)), 0);
		vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			Records r;
			r.assign(big);
			const int err = inj.run([&] { return run(set_cmd, target(r)); });
			if (!inj.fired()) {
				EXPECT_EQ(err, 0);
				return;
			}
			EXPECT_EQ(err, ENOMEM);
			Label got;
			EXPECT_EQ(get_label(get_cmd, target(r), r, &got), 0);
			EXPECT_EQ(got, kPlain);
		});
		vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			Records r;
			r.offer(4000, 100, 100);
			const Snapshot before(r);
			const int err = inj.run([&] { return run(get_cmd, target(r)); });
			if (!inj.fired()) {
				EXPECT_EQ(err, 0);
				EXPECT_EQ(r.value(), big);
				return;
			}
			EXPECT_EQ(err, ENOMEM);
			EXPECT_TRUE(Snapshot(r) == before);
		});
	}
}

} // namespace
