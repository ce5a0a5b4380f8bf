// Kernel label calls end to end, against the real service stand-in: a label
// set on a file, a link, a descriptor or a process reads back equal, here and
// in a forked child that opens the service afresh.  Built twice: for the
// attribute namespace "user" (any user) and for "trusted", which needs root
// but lets a symbolic link carry a label of its own.
#include <vyr/kernel.h>

#include "support/labels.hh"
#include "support/scratch_dir.hh"

#include <gtest/gtest.h>

#include <fcntl.h>
#include <functional>
#include <sys/wait.h>
#include <sys/xattr.h>
#include <unistd.h>

namespace {

using LabelPtr = vyr_test::Label;

// A 64-byte blob and both role lists, so that every read takes an E2BIG.
LabelPtr sample_label(uint8_t seed)
{
	const vyr_role_t r1[] = {{100u + seed, 1, 7}, {50, 2, 3}}, r2[] = {{9, 0xffffffffu, 0xff}};
	LabelPtr l(vyrl_get_new_init_mac_roles(3, 2, 0x8000000000000005u | seed, 4, r1, 2, r2, 1));
	l->ml->blob = static_cast<unsigned char *>(std::malloc(64));
	l->ml->blob_size = 64;
	for (int i = 0; i < 64; ++i)
		l->ml->blob[i] = static_cast<unsigned char>(seed * 3 + i);
	return l;
}

bool same(vyrl_t *got, const vyrl_t *want) { return got && vyrl_cmp(LabelPtr(got).get(), want, 0) == 1; }

// Runs `check` in a forked child that starts the service afresh, as another
// program would; true when the child's check held.
bool in_child(const std::function<bool()> &check)
{
	const pid_t pid = fork();
	if (pid == 0) {
		vyr_release();
		_exit(check() ? 0 : 1);
	}
	int status = 0;
	return pid > 0 && waitpid(pid, &status, 0) == pid && WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

// f(fd) on `path` opened with `flags`; O_PATH descriptors are refused by the
// f*xattr calls, so the service must reach their file another way.
template <class F> auto with_fd(const std::string &path, int flags, F &&f)
{
	const int fd = open(path.c_str(), flags);
	const auto result = f(fd);
	return close(fd), result;
}

class VYR_E2E_SUITE : public ::testing::Test {
protected:
	// Before the first call opens the service, which reads its settings once.
	static void SetUpTestSuite()
	{
		static vyr_test::ScratchDir state;
		setenv("VYR_TAVREL_XATTR_NS", VYR_E2E_NS, 1);
		setenv("VYR_TAVREL_STATE_DIR", state.path().c_str(), 0); // a caller's own wins
	}
	void SetUp() override
	{
		ASSERT_TRUE(dir_.ok());
		close(open(file_.c_str(), O_CREAT | O_WRONLY, 0600));
		ASSERT_EQ(symlink(file_.c_str(), link_.c_str()), 0);
		if (setxattr(file_.c_str(), VYR_E2E_NS ".vyr-probe", "x", 1, 0) != 0)
			GTEST_SKIP() << "no " VYR_E2E_NS " attributes here; point TMPDIR elsewhere";
	}

	vyr_test::ScratchDir dir_;
	const std::string file_ = dir_ / "file", link_ = dir_ / "link";
};

// Each kind of target: set, then read back here and in another process; a
// smaller label then replaces the first one entirely.
TEST_F(VYR_E2E_SUITE, SetThenGetHereAndInAnotherProcess)
{
	const std::string f = file_;
	const pid_t self = getpid();
	const struct {
		const char *name;
		std::function<int(vyrl_t *)> set;
		std::function<vyrl_t *()> get, get_in_child;
	} targets[] = {
	    {"path", [&](vyrl_t *l) { return vyr_set_path(f.c_str(), l); }, [&] { return vyr_get_path(f.c_str()); },
	     [&] { return vyr_get_path(f.c_str()); }},
	    {"fd", [&](vyrl_t *l) { return with_fd(f, O_RDONLY, [&](int fd) { return vyr_set_fd(fd, l); }); },
	     [&] { return with_fd(f, O_PATH, vyr_get_fd); }, [&] { return with_fd(f, O_RDONLY, vyr_get_fd); }},
	    {"O_PATH fd", [&](vyrl_t *l) { return with_fd(f, O_PATH, [&](int fd) { return vyr_set_fd(fd, l); }); },
	     [&] { return vyr_get_path(f.c_str()); }, [&] { return with_fd(f, O_PATH, vyr_get_fd); }},
	    {"pid", [&](vyrl_t *l) { return vyr_set_pid(self, l); }, [&] { return vyr_get_pid(0); },
	     [] { return vyr_get_pid(getppid()); }},
	};
	for (const auto &t : targets) {
		SCOPED_TRACE(t.name);
		LabelPtr big = sample_label(1), small(vyrl_get_new_init_mac(1, 0, 2, 0));
		ASSERT_EQ(t.set(big.get()), 0);
		EXPECT_TRUE(same(t.get(), big.get()));
		EXPECT_TRUE(in_child([&] { return same(t.get_in_child(), big.get()); }));
		ASSERT_EQ(t.set(small.get()), 0);
		EXPECT_TRUE(same(t.get(), small.get()));
		EXPECT_EQ(vyrl_ucnt(small.get()), 1);
	}
}

// A process without a label of its own has its nearest labelled ancestor's,
// as if copied at fork; a child's own label stays its own.
TEST_F(VYR_E2E_SUITE, ProcessesInheritFromTheNearestAncestor)
{
	LabelPtr mine = sample_label(2), childs = sample_label(5);
	ASSERT_EQ(vyr_set_pid(0, mine.get()), 0);
	EXPECT_TRUE(in_child([&] {
		return same(vyr_get_pid(0), mine.get()) && vyr_set_pid(0, childs.get()) == 0 &&
		       in_child([&] { return same(vyr_get_pid(0), childs.get()); });
	}));
	EXPECT_TRUE(same(vyr_get_pid(0), mine.get()));
}

// The path commands follow a final link; the lpath commands take the link,
// which has no label of its own at first.
TEST_F(VYR_E2E_SUITE, LinkFollowedByPathNotByLpath)
{
	LabelPtr l = sample_label(3), mark = sample_label(4);
	ASSERT_EQ(vyr_set_path(link_.c_str(), l.get()), 0);
	EXPECT_TRUE(same(vyr_get_path(file_.c_str()), l.get()));
	EXPECT_TRUE(same(vyr_get_lpath(link_.c_str()), VYRL_ZERO));
	if (std::string(VYR_E2E_NS) == "user") {
		// Links take no user attributes: setting one fails and changes nothing.
		errno = 0;
		EXPECT_NE(vyr_set_lpath(link_.c_str(), mark.get()), 0);
		EXPECT_EQ(errno, EPERM);
		EXPECT_TRUE(same(vyr_get_path(file_.c_str()), l.get()));
		return;
	}
	ASSERT_EQ(vyr_set_lpath(link_.c_str(), mark.get()), 0);
	EXPECT_TRUE(same(vyr_get_lpath(link_.c_str()), mark.get()));
	EXPECT_TRUE(same(vyr_get_path(link_.c_str()), l.get()));
	EXPECT_TRUE(in_child([&] { return same(vyr_get_lpath(link_.c_str()), mark.get()); }));
	// On a plain file, the lpath commands act like the path commands.
	ASSERT_EQ(vyr_set_lpath(file_.c_str(), mark.get()), 0);
	EXPECT_TRUE(same(vyr_get_path(file_.c_str()), mark.get()));
}

} // namespace
