// Session directories on the real file system, labelled through the label
// service stand-in (file labels in an extended attribute).
#include <vyr/kernel.h>
#include <vyr/label.h>
#include <vyr/session.h>

#include "repr/textout_guard.hh"
#include "support/failalloc.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <string>
#include <sys/stat.h>
#include <thread>
#include <unistd.h>

#if defined(__SANITIZE_ADDRESS__)
#include <sanitizer/lsan_interface.h>
#endif

namespace {

// Keeps the leak checker away from what a call allocates: for calls that
// may end in the obstack failure handler, whose jump back abandons what the
// call held.  The sweep's own live-block check still covers every other run.
class UnwatchedAllocations {
public:
#if defined(__SANITIZE_ADDRESS__)
	UnwatchedAllocations() { __lsan_disable(); }
	~UnwatchedAllocations() { __lsan_enable(); }
#else
	UnwatchedAllocations() {}
	~UnwatchedAllocations() {}
#endif
	UnwatchedAllocations(const UnwatchedAllocations &) = delete;
	UnwatchedAllocations &operator=(const UnwatchedAllocations &) = delete;
};

struct LabelPut {
	void operator()(vyrl_t *l) const noexcept { vyrl_put(l); }
};
using Label = std::unique_ptr<vyrl_t, LabelPut>;

std::string take(char *s)
{
	if (s == nullptr)
		return "<null>";
	std::string r(s);
	std::free(s);
	return r;
}

Label make_label(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type)
{
	Label l{vyrl_get_new_init_mac(lev, ilev, cat, type)};
	EXPECT_NE(l, nullptr);
	return l;
}

struct stat stat_of(const std::string &path)
{
	struct stat st {};
	EXPECT_EQ(stat(path.c_str(), &st), 0) << path << ": " << std::strerror(errno);
	return st;
}

bool is_link(const std::string &path)
{
	struct stat st {};
	return lstat(path.c_str(), &st) == 0 && S_ISLNK(st.st_mode);
}

std::string link_target(const std::string &path)
{
	char buf[4096];
	const ssize_t n = readlink(path.c_str(), buf, sizeof buf);
	return n < 0 ? "<none>" : std::string(buf, static_cast<size_t>(n));
}

// The label stored on a path, as (lev, ilev, cat, type).
struct Fields {
	int lev, ilev;
	uint64_t cat;
	int type;
	bool operator==(const Fields &) const = default;
};

std::ostream &operator<<(std::ostream &os, const Fields &f)
{
	return os << "{" << f.lev << "," << f.ilev << ",0x" << std::hex << f.cat << ",0x" << f.type << std::dec << "}";
}

Fields label_of(const std::string &path)
{
	Label l{vyr_get_path(path.c_str())};
	if (!l) {
		ADD_FAILURE() << "no label on " << path;
		return {-1, -1, 0, -1};
	}
	return {l->ml->lev, l->ml->ilev, l->ml->cat, l->ml->type};
}

Fields fields(const vyrl_t *l)
{
	return {l->ml->lev, l->ml->ilev, l->ml->cat, l->ml->type};
}

void set_label(const std::string &path, uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type)
{
	Label l = make_label(lev, ilev, cat, type);
	ASSERT_EQ(vyr_set_path(path.c_str(), l.get()), 0) << path;
}

// ctime moves with every chown, chmod and label change, so an unchanged
// ctime after a call shows that the call wrote nothing.  The file system's
// clock is coarse: wait long enough for a write to show.
struct timespec ctime_after_pause(const std::string &path)
{
	const struct timespec t = stat_of(path).st_ctim;
	std::this_thread::sleep_for(std::chrono::milliseconds(20));
	return t;
}

bool same_time(const struct timespec &a, const struct timespec &b)
{
	return a.tv_sec == b.tv_sec && a.tv_nsec == b.tv_nsec;
}

class SessionDir : public ::testing::Test {
protected:
	static void SetUpTestSuite()
	{
		// Unprivileged attribute namespace unless the caller chose one.
		setenv("VYR_TAVREL_XATTR_NS", "user", 0);
		state_dir_ = make_dir("state");
		setenv("VYR_TAVREL_STATE_DIR", state_dir_.c_str(), 0);
	}

	static void TearDownTestSuite()
	{
		std::error_code ec;
		std::filesystem::remove_all(state_dir_, ec);
	}

	static inline std::string state_dir_;

	static std::string make_dir(const char *what)
	{
		const char *tmp = std::getenv("TMPDIR");
		std::string templ = std::string(tmp != nullptr && *tmp != '\0' ? tmp : "/tmp") + "/vyr-session-" + what + "-XXXXXX";
		if (mkdtemp(templ.data()) == nullptr)
			ADD_FAILURE() << "mkdtemp: " << std::strerror(errno);
		return templ;
	}

	void SetUp() override
	{
		base_ = make_dir("base");
		uid_ = getuid();
		gid_ = getgid();
		// A label of the base to tell it apart from the zero label.
		set_label(base_, 3, 0, 0x40, 0);
	}

	void TearDown() override
	{
		std::error_code ec;
		std::filesystem::remove_all(base_, ec);
		EXPECT_FALSE(ec) << base_ << ": " << ec.message();
	}

	std::string path(const std::string &rel) const { return base_ + "/" + rel; }

	std::string base_;
	uid_t uid_;
	gid_t gid_;
};

// ---- session paths ----

TEST_F(SessionDir, PathIsFormedFromNumbersOnly)
{
	struct Case {
		uint8_t lev, ilev;
		uint64_t cat;
		uint16_t type;
		const char *base, *sub;
		const char *path;
	} cases[] = {
		{2, 1, 5, 3, "/tmp", "s", "/tmp/s/l2i1c0x5t0x3"},
		{0, 0, 0, 0, "/tmp", "s", "/tmp/s/l0i0c0x0t0x0"},
		{0, 0, 0, 0, "/tmp", "", "/tmp//l0i0c0x0t0x0"},
		{0, 0, 0, 0, "/tmp", nullptr, "/tmp//l0i0c0x0t0x0"},
		{255, 255, UINT64_MAX, 0xffff, "b", "s/t", "b/s/t/l255i255c0xfffffffffffffffft0xffff"},
	};
	for (const Case &c : cases) {
		Label l = make_label(c.lev, c.ilev, c.cat, c.type);
		// neither roles nor blob show in the path
		EXPECT_EQ(take(vyrl_session_dir(c.base, c.sub, l.get())), c.path);
		EXPECT_EQ(take(vyrml_session_dir(c.base, c.sub, l->ml)), c.path);
	}
}

TEST_F(SessionDir, PathBuildingReleasesEverythingOnFailure)
{
	Label l = make_label(2, 1, 5, 3);
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		bool aborted = false;
		char *s = inj.run([&] {
			return textout_test::guarded([&] { return vyrml_session_dir("/tmp", "s", l->ml); }, &aborted);
		});
		if (!inj.fired())
			EXPECT_EQ(take(s), "/tmp/s/l2i1c0x5t0x3");
		else
			EXPECT_EQ(s, nullptr); // nothing else is held: also after the handler

	});
}

// ---- vyrlugm_mkdir ----

TEST_F(SessionDir, MkdirCreatesWithExactModeAndRestoresTheMask)
{
	Label l = make_label(4, 0, 0x3, 1);
	for (mode_t mask : {mode_t{077}, mode_t{0}, mode_t{0777}}) {
		const std::string p = path("m" + std::to_string(mask));
		const mode_t old = umask(mask);
		EXPECT_EQ(vyrlugm_mkdir(p.c_str(), l.get(), uid_, gid_, 0750), 0);
		EXPECT_EQ(umask(old), mask) << "the process mask changed";
		const struct stat st = stat_of(p);
		EXPECT_TRUE(S_ISDIR(st.st_mode));
		EXPECT_EQ(st.st_mode & 07777, 0750u);
		EXPECT_EQ(label_of(p), (Fields{4, 0, 0x3, 1}));
	}
}

TEST_F(SessionDir, MkdirLeavesTheCallersLabelAlone)
{
	Label l = make_label(4, 2, 0x3, 1);
	ASSERT_EQ(vyrlugm_mkdir(path("d").c_str(), l.get(), uid_, gid_, 0700), 0);
	// a non-zero integrity level adds "ccnri" on the directory only
	EXPECT_EQ(label_of(path("d")), (Fields{4, 2, 0x3, 1 | 2}));
	EXPECT_EQ(fields(l.get()), (Fields{4, 2, 0x3, 1}));
	EXPECT_EQ(vyrl_ucnt(l.get()), 1);
	EXPECT_EQ(vyrml_ucnt(l->ml), 1);
	EXPECT_EQ(vyrrl_ucnt(l->rl), 1);
}

TEST_F(SessionDir, MkdirReplacesWhatIsNotADirectory)
{
	Label l = make_label(1, 0, 0, 0);
	// a regular file
	const std::string file = path("file");
	close(open(file.c_str(), O_CREAT | O_WRONLY, 0600));
	EXPECT_EQ(vyrlugm_mkdir(file.c_str(), l.get(), uid_, gid_, 0700), 0);
	EXPECT_TRUE(S_ISDIR(stat_of(file).st_mode));

	// a symbolic link to a file: the link goes, the file stays
	const std::string target = path("target");
	close(open(target.c_str(), O_CREAT | O_WRONLY, 0600));
	const std::string link = path("link");
	ASSERT_EQ(symlink(target.c_str(), link.c_str()), 0);
	EXPECT_EQ(vyrlugm_mkdir(link.c_str(), l.get(), uid_, gid_, 0700), 0);
	EXPECT_FALSE(is_link(link));
	EXPECT_TRUE(S_ISDIR(stat_of(link).st_mode));
	EXPECT_TRUE(S_ISREG(stat_of(target).st_mode));
}

TEST_F(SessionDir, MkdirRepairsADirectoryThroughASymbolicLink)
{
	const std::string dir = path("real");
	ASSERT_EQ(mkdir(dir.c_str(), 0755), 0);
	const std::string link = path("via");
	ASSERT_EQ(symlink(dir.c_str(), link.c_str()), 0);
	Label l = make_label(6, 0, 0x10, 4);
	EXPECT_EQ(vyrlugm_mkdir(link.c_str(), l.get(), uid_, gid_, 0711), 0);
	EXPECT_TRUE(is_link(link));
	EXPECT_EQ(stat_of(dir).st_mode & 07777, 0711u);
	EXPECT_EQ(label_of(dir), (Fields{6, 0, 0x10, 4}));
}

TEST_F(SessionDir, MkdirFailsOnADanglingLink)
{
	const std::string link = path("dangling");
	ASSERT_EQ(symlink(path("nowhere").c_str(), link.c_str()), 0);
	Label l = make_label(1, 0, 0, 0);
	errno = 0;
	EXPECT_EQ(vyrlugm_mkdir(link.c_str(), l.get(), uid_, gid_, 0700), -1);
	EXPECT_EQ(errno, EEXIST);
	EXPECT_TRUE(is_link(link));
}

TEST_F(SessionDir, MkdirReportsPathsItCannotUse)
{
	Label l = make_label(1, 0, 0, 0);
	const std::string file = path("plain");
	close(open(file.c_str(), O_CREAT | O_WRONLY, 0600));
	errno = 0;
	EXPECT_EQ(vyrlugm_mkdir((file + "/sub").c_str(), l.get(), uid_, gid_, 0700), -1);
	EXPECT_EQ(errno, ENOTDIR);
	errno = 0;
	EXPECT_EQ(vyrlugm_mkdir(path("missing/sub").c_str(), l.get(), uid_, gid_, 0700), -1);
	EXPECT_EQ(errno, ENOENT);
}

TEST_F(SessionDir, MkdirChangesNothingThatIsRight)
{
	Label l = make_label(4, 1, 0x3, 0);
	const std::string d = path("d");
	ASSERT_EQ(vyrlugm_mkdir(d.c_str(), l.get(), uid_, gid_, 0700), 0);
	const struct timespec before = ctime_after_pause(d);
	EXPECT_EQ(vyrlugm_mkdir(d.c_str(), l.get(), uid_, gid_, 0700), 0);
	EXPECT_TRUE(same_time(before, stat_of(d).st_ctim)) << "a second call wrote to the directory";
	EXPECT_EQ(label_of(d), (Fields{4, 1, 0x3, 2}));
}

TEST_F(SessionDir, MkdirRepairsModeAndLabel)
{
	const std::string d = path("d");
	ASSERT_EQ(mkdir(d.c_str(), 0777), 0);
	ASSERT_EQ(chmod(d.c_str(), 0777), 0);
	set_label(d, 9, 0, 0xff, 7);
	Label l = make_label(4, 0, 0x3, 0);
	EXPECT_EQ(vyrlugm_mkdir(d.c_str(), l.get(), uid_, gid_, 0700), 0);
	EXPECT_EQ(stat_of(d).st_mode & 07777, 0700u);
	EXPECT_EQ(label_of(d), (Fields{4, 0, 0x3, 0}));
}

TEST_F(SessionDir, MkdirRepairsOwnerAndGroup)
{
	if (geteuid() != 0)
		GTEST_SKIP() << "changing owners needs root";
	const std::string d = path("d");
	ASSERT_EQ(mkdir(d.c_str(), 0700), 0);
	Label l = make_label(0, 0, 0, 0);
	// wrong group only: both are passed to chown
	ASSERT_EQ(chown(d.c_str(), uid_, 4321), 0);
	EXPECT_EQ(vyrlugm_mkdir(d.c_str(), l.get(), uid_, gid_, 0700), 0);
	EXPECT_EQ(stat_of(d).st_uid, uid_);
	EXPECT_EQ(stat_of(d).st_gid, gid_);
	// wrong owner
	ASSERT_EQ(chown(d.c_str(), 1234, gid_), 0);
	EXPECT_EQ(vyrlugm_mkdir(d.c_str(), l.get(), uid_, gid_, 0700), 0);
	EXPECT_EQ(stat_of(d).st_uid, uid_);
	// and to another owner
	EXPECT_EQ(vyrlugm_mkdir(d.c_str(), l.get(), 1234, 4321, 0700), 0);
	EXPECT_EQ(stat_of(d).st_uid, 1234u);
	EXPECT_EQ(stat_of(d).st_gid, 4321u);
}

TEST_F(SessionDir, MkdirReleasesItsLabelsOnEveryFailure)
{
	const std::string d = path("d");
	Label l = make_label(4, 1, 0x3, 0);
	long failures = 0;
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		mkdir(d.c_str(), 0700); // there already after the first attempt
		set_label(d, 8, 0, 0, 0);
		const int rc = inj.run([&] { return vyrlugm_mkdir(d.c_str(), l.get(), uid_, gid_, 0700); });
		if (!inj.fired()) {
			EXPECT_EQ(rc, 0);
			EXPECT_EQ(label_of(d), (Fields{4, 1, 0x3, 2}));
			return;
		}
		failures += rc == -1;
	});
	EXPECT_GE(failures, 2); // reading the present label, copying the caller's
	EXPECT_EQ(fields(l.get()), (Fields{4, 1, 0x3, 0}));
}

// ---- vyrlugm_make_session_dir ----

TEST_F(SessionDir, SessionWithLinksUnderASubDirectory)
{
	Label l = make_label(2, 0, 0x5, 0);
	const std::string s = take(vyrlugm_make_session_dir(base_.c_str(), "s", "home", l.get(), uid_, gid_, 0700));
	EXPECT_EQ(s, base_ + "/s/l2i0c0x5t0x0"); // the caller's type, not the directory's
	// the parent carries the label of the base
	EXPECT_EQ(label_of(base_ + "/s"), (Fields{3, 0, 0x40, 0}));
	EXPECT_EQ(stat_of(base_ + "/s").st_mode & 07777, 0700u);
	// the session directory carries the caller's label with CCNRA added
	EXPECT_EQ(label_of(s), (Fields{2, 0, 0x5, 3}));
	EXPECT_EQ(link_target(s + "/home"), base_ + "/s");
	EXPECT_EQ(link_target(s + "/vyr"), base_ + "/s");
	EXPECT_EQ(fields(l.get()), (Fields{2, 0, 0x5, 0}));
	EXPECT_EQ(vyrl_ucnt(l.get()), 1);
}

TEST_F(SessionDir, SessionWithoutLinks)
{
	for (const char *link : {static_cast<const char *>(nullptr), ""}) {
		Label l = make_label(7, 1, 0x1, 4);
		const std::string s = take(vyrlugm_make_session_dir(base_.c_str(), "s", link, l.get(), uid_, gid_, 0750));
		EXPECT_EQ(s, base_ + "/s/l7i1c0x1t0x4");
		EXPECT_EQ(label_of(s), (Fields{7, 1, 0x1, 4 | 2}));
		EXPECT_FALSE(is_link(s + "/vyr"));
		EXPECT_EQ(stat_of(s).st_mode & 07777, 0750u);
		EXPECT_EQ(vyrl_ucnt(l.get()), 1);
	}
}

TEST_F(SessionDir, SessionWithoutSubDirectoryLinksToTheBase)
{
	Label l = make_label(1, 0, 0, 0);
	const std::string s = take(vyrlugm_make_session_dir(base_.c_str(), "", "up", l.get(), uid_, gid_, 0700));
	EXPECT_EQ(s, base_ + "//l1i0c0x0t0x0");
	EXPECT_EQ(link_target(s + "/up"), base_);
	EXPECT_EQ(link_target(s + "/vyr"), base_);
	// the base itself is not touched
	EXPECT_EQ(label_of(base_), (Fields{3, 0, 0x40, 0}));

	Label m = make_label(2, 0, 0, 0);
	EXPECT_EQ(take(vyrlugm_make_session_dir(base_.c_str(), nullptr, nullptr, m.get(), uid_, gid_, 0700)),
	          base_ + "//l2i0c0x0t0x0");
}

TEST_F(SessionDir, SecondSessionCallChangesNothing)
{
	Label l = make_label(2, 1, 0x5, 1);
	const std::string first = take(vyrlugm_make_session_dir(base_.c_str(), "s", "home", l.get(), uid_, gid_, 0700));
	ASSERT_NE(first, "<null>");
	const struct timespec dir_before = ctime_after_pause(first);
	const struct timespec parent_before = stat_of(base_ + "/s").st_ctim;
	const std::string second = take(vyrlugm_make_session_dir(base_.c_str(), "s", "home", l.get(), uid_, gid_, 0700));
	EXPECT_EQ(second, first);
	EXPECT_TRUE(same_time(parent_before, stat_of(base_ + "/s").st_ctim));
	// the links are there already; the failed symlink calls change nothing
	EXPECT_TRUE(same_time(dir_before, stat_of(first).st_ctim));
	EXPECT_EQ(link_target(first + "/home"), base_ + "/s");
}

TEST_F(SessionDir, SessionFailures)
{
	Label l = make_label(1, 0, 0, 0);
	// no base: its label can't be read
	errno = 0;
	EXPECT_EQ(take(vyrlugm_make_session_dir(path("none").c_str(), "s", nullptr, l.get(), uid_, gid_, 0700)),
	          "<null>");
	EXPECT_EQ(errno, ENOENT);
	// a base without sub-directory whose session directory can't be made
	EXPECT_EQ(take(vyrlugm_make_session_dir(path("none").c_str(), "", "x", l.get(), uid_, gid_, 0700)),
	          "<null>");
	// a file where the parent should be
	close(open(path("s").c_str(), O_CREAT | O_WRONLY, 0600));
	Label m = make_label(1, 0, 0, 0);
	EXPECT_EQ(take(vyrlugm_make_session_dir(base_.c_str(), "s/t", nullptr, m.get(), uid_, gid_, 0700)),
	          "<null>");
	EXPECT_EQ(vyrl_ucnt(l.get()), 1);
	EXPECT_EQ(vyrl_ucnt(m.get()), 1);
}

TEST_F(SessionDir, SessionReleasesEverythingOnFailure)
{
	Label l = make_label(2, 1, 0x5, 0);
	long nulls = 0, aborted_runs = 0;
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		bool aborted = false;
		char *s;
		{
			UnwatchedAllocations unwatched;
			s = inj.run([&] {
				return textout_test::guarded(
					[&] { return vyrlugm_make_session_dir(base_.c_str(), "s", "home", l.get(), uid_, gid_, 0700); },
					&aborted);
			});
		}
		if (!inj.fired()) {
			EXPECT_FALSE(aborted);
			EXPECT_EQ(take(s), base_ + "/s/l2i1c0x5t0x0");
			return;
		}
		if (aborted) {
			// The session path's obstack got no memory: that ends in the
			// obstack failure handler, which in a real program does not come
			// back (by default it exits).  What the call held at that moment
			// is not the call's leak; forget it.
			++aborted_runs;
			vyr_test::FailAlloc::reset();
			return;
		}
		nulls += s == nullptr;
		std::free(s); // a link that could not be formed is no failure
	});
	EXPECT_EQ(aborted_runs, 1);
	EXPECT_GE(nulls, 3);
	EXPECT_EQ(vyrl_ucnt(l.get()), 1);
	EXPECT_EQ(fields(l.get()), (Fields{2, 1, 0x5, 0}));
}

} // namespace
