// Session directories on the real file system, labelled through the label
// service stand-in (file labels in an extended attribute).
#include <vyr/kernel.h>
#include <vyr/session.h>

#include "support/failalloc.h"
#include "support/labels.hh"
#include "support/obstack_guard.hh"
#include "support/scratch_dir.hh"

#include <gtest/gtest.h>

#include <fcntl.h>
#include <filesystem>
#include <functional>
#include <sys/stat.h>
#include <thread>
#include <tuple>
#include <unistd.h>
#include <valgrind/valgrind.h>
#if defined(__SANITIZE_ADDRESS__)
#include <sanitizer/lsan_interface.h>
#endif

namespace {

using vyr_test::Label;
using Fields = std::tuple<int, int, uint64_t, int>; // lev, ilev, cat, type

Label make_label(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type)
{
	return Label{vyrl_get_new_init_mac(lev, ilev, cat, type)};
}
Fields fields(const vyrl_t *l) { return {l->ml->lev, l->ml->ilev, l->ml->cat, l->ml->type}; }
Fields label_of(const std::string &path)
{
	Label l{vyr_get_path(path.c_str())};
	return l ? fields(l.get()) : Fields{-1, -1, 0, -1};
}
std::string take(char *s)
{
	const std::string out = s ? s : "<null>";
	return std::free(s), out;
}
struct stat stat_of(const std::string &path)
{
	struct stat st {};
	EXPECT_EQ(stat(path.c_str(), &st), 0) << path;
	return st;
}
std::string link_target(const std::string &path)
{
	std::error_code ec;
	const auto to = std::filesystem::read_symlink(path, ec);
	return ec ? "<none>" : to.string();
}
void touch(const std::string &path) { close(open(path.c_str(), O_CREAT | O_WRONLY, 0600)); }

class SessionDir : public ::testing::Test {
protected:
	void SetUp() override
	{
		ASSERT_TRUE(dir_.ok());
		// A label of the base, to tell it apart from the zero label.
		ASSERT_EQ(vyr_set_path(base_.c_str(), make_label(3, 0, 0x40, 0).get()), 0);
	}
	int mkdir_as_me(const std::string &p, const Label &l) { return vyrlugm_mkdir(p.c_str(), l.get(), uid_, gid_, 0750); }
	char *session(const char *sub, const char *link, const Label &l, const std::string &base = "")
	{
		return vyrlugm_make_session_dir((base.empty() ? base_ : base).c_str(), sub, link, l.get(), uid_, gid_, 0750);
	}

	vyr_test::ScratchDir dir_;
	const std::string base_ = dir_.path();
	const uid_t uid_ = getuid();
	const gid_t gid_ = getgid();
};

// Neither roles nor blob show in the path; an empty or NULL SUB leaves "//".
TEST_F(SessionDir, PathIsFormedFromNumbersOnly)
{
	const struct {
		uint8_t lev, ilev;
		uint64_t cat;
		uint16_t type;
		const char *base, *sub, *path;
	} cases[] = {
	    {2, 1, 5, 3, "/tmp", "s", "/tmp/s/l2i1c0x5t0x3"},
	    {0, 0, 0, 0, "/tmp", "", "/tmp//l0i0c0x0t0x0"},
	    {0, 0, 0, 0, "/tmp", nullptr, "/tmp//l0i0c0x0t0x0"},
	    {255, 255, UINT64_MAX, 0xffff, "b", "s/t", "b/s/t/l255i255c0xfffffffffffffffft0xffff"},
	};
	const vyr_role_t role{7, 0, 1};
	for (const auto &c : cases) {
		Label l{vyrl_get_new_init_mac_roles(c.lev, c.ilev, c.cat, c.type, &role, 1, &role, 1)};
		EXPECT_EQ(take(vyrl_session_dir(c.base, c.sub, l.get())), c.path);
		EXPECT_EQ(take(vyrml_session_dir(c.base, c.sub, l->ml)), c.path);
	}
}

// What vyrlugm_mkdir makes of what it finds at the path.  The mode is exact
// whatever the process mask, and the mask is put back; a non-zero integrity
// level adds "ccnri" on the directory only.  A second call on a directory
// that is right writes nothing: ctime moves with every chown, chmod and
// label change.
TEST_F(SessionDir, MkdirOnWhatIsThere)
{
	const std::string file = dir_ / "file", real = dir_ / "real";
	touch(file);
	ASSERT_EQ(mkdir(real.c_str(), 0777), 0); // wrong mode and label, repaired through a link
	ASSERT_EQ(vyr_set_path(real.c_str(), make_label(9, 0, 0xff, 7).get()), 0);
	const auto link_to = [](const std::string &to) {
		return [to](const std::string &p) { ASSERT_EQ(symlink(to.c_str(), p.c_str()), 0); };
	};
	const struct {
		const char *name;
		std::function<void(const std::string &)> make;
		bool below; // the path is one below what was made
		int err;
		bool link_stays;
	} cases[] = {
	    {"nothing", [](const std::string &) {}, false, 0, false},
	    {"a file: replaced", touch, false, 0, false},
	    {"a link to a file: the link goes, the file stays", link_to(file), false, 0, false},
	    {"a link to a directory: repaired through it", link_to(real), false, 0, true},
	    {"a dangling link: stat sees nothing, mkdir the link", link_to(dir_ / "nowhere"), false, EEXIST, true},
	    {"below a file", touch, true, ENOTDIR, false},
	    {"below nothing", [](const std::string &) {}, true, ENOENT, false},
	};
	Label l = make_label(4, 2, 0x3, 1);
	int n = 0;
	for (const auto &c : cases) {
		SCOPED_TRACE(c.name);
		const std::string p = dir_ / std::to_string(n++);
		c.make(p);
		const mode_t old = umask(077);
		errno = 0;
		const int rc = mkdir_as_me(c.below ? p + "/sub" : p, l);
		EXPECT_EQ(umask(old), 077u) << "the process mask changed";
		EXPECT_EQ(std::filesystem::is_symlink(p), c.link_stays);
		EXPECT_EQ(rc, c.err ? -1 : 0);
		EXPECT_EQ(c.err ? errno : 0, c.err);
		if (c.err == 0) {
			EXPECT_EQ(stat_of(p).st_mode & (S_IFMT | 07777), S_IFDIR | 0750u);
			EXPECT_EQ(label_of(p), Fields(4, 2, 0x3, 1 | 2));
		}
	}
	EXPECT_TRUE(S_ISREG(stat_of(file).st_mode));
	const auto ctime = [&] { return stat_of(dir_ / "0").st_ctim; };
	const auto before = ctime();
	std::this_thread::sleep_for(std::chrono::milliseconds(20)); // long enough for the clock to move
	EXPECT_EQ(mkdir_as_me(dir_ / "0", l), 0);
	EXPECT_TRUE(ctime().tv_sec == before.tv_sec && ctime().tv_nsec == before.tv_nsec) << "a second call wrote";
	EXPECT_EQ(fields(l.get()), Fields(4, 2, 0x3, 1));
	EXPECT_EQ(vyrl_ucnt(l.get()) + vyrml_ucnt(l->ml) + vyrrl_ucnt(l->rl), 3);
}

TEST_F(SessionDir, MkdirRepairsOwnerAndGroup)
{
	if (geteuid() != 0)
		GTEST_SKIP() << "changing owners needs root";
	const std::string d = dir_ / "d";
	ASSERT_EQ(mkdir(d.c_str(), 0700), 0);
	ASSERT_EQ(chown(d.c_str(), uid_, 4321), 0); // the group alone is wrong
	Label l = make_label(0, 0, 0, 0);
	EXPECT_EQ(mkdir_as_me(d, l), 0);
	EXPECT_EQ(stat_of(d).st_gid, gid_);
	EXPECT_EQ(vyrlugm_mkdir(d.c_str(), l.get(), 1234, 4321, 0700), 0);
	EXPECT_EQ(stat_of(d).st_uid, 1234u);
	EXPECT_EQ(stat_of(d).st_gid, 4321u);
}

// The session directory carries the caller's label, with CCNRA added when
// it has links (and "ccnri" for its integrity level), while its name shows
// the caller's type.  A parent base/SUB is made only for a non-empty SUB and
// carries the base's label; the links point at it, or else at the base.
TEST_F(SessionDir, SessionDirectories)
{
	const std::string parent = dir_ / "s";
	const struct {
		uint8_t lev;
		const char *sub, *link;
		std::string path, links_to;
		int type;
	} cases[] = {
	    {2, "s", "home", parent + "/l2i0c0x5t0x0", parent, 3},
	    {3, "s", nullptr, parent + "/l3i1c0x5t0x0", "<none>", 2},
	    {4, "s", "", parent + "/l4i0c0x5t0x0", "<none>", 0},
	    {5, "", "up", base_ + "//l5i1c0x5t0x0", base_, 3},
	    {6, nullptr, nullptr, base_ + "//l6i0c0x5t0x0", "<none>", 0},
	};
	for (const auto &c : cases) {
		SCOPED_TRACE(c.path);
		Label l = make_label(c.lev, c.lev % 2, 0x5, 0); // integrity level 1 on odd levels
		const std::string s = take(session(c.sub, c.link, l));
		EXPECT_EQ(s, c.path);
		EXPECT_EQ(label_of(s), Fields(c.lev, c.lev % 2, 0x5, c.type));
		EXPECT_EQ(stat_of(s).st_mode & 07777, 0750u);
		EXPECT_EQ(link_target(s + "/vyr"), c.links_to);
		EXPECT_EQ(link_target(s + "/" + (c.link && *c.link ? c.link : "vyr")), c.links_to);
		EXPECT_EQ(fields(l.get()), Fields(c.lev, c.lev % 2, 0x5, 0));
		EXPECT_EQ(vyrl_ucnt(l.get()), 1);
	}
	EXPECT_EQ(label_of(parent), Fields(3, 0, 0x40, 0));
	EXPECT_EQ(stat_of(parent).st_mode & 07777, 0750u);
	EXPECT_EQ(stat_of(base_).st_mode & 07777, 0700u); // no parent made of the base
	// A second call finds everything in place, links included.
	EXPECT_EQ(take(session("s", "home", make_label(2, 0, 0x5, 0))), cases[0].path);
}

TEST_F(SessionDir, SessionFailures)
{
	Label l = make_label(1, 0, 0, 0);
	errno = 0; // no base: its label can't be read
	EXPECT_EQ(take(session("s", nullptr, l, dir_ / "none")), "<null>");
	EXPECT_EQ(errno, ENOENT);
	// no base and no sub-directory: the session directory can't be made
	EXPECT_EQ(take(session("", "x", l, dir_ / "none")), "<null>");
	touch(dir_ / "s"); // a file where the parent should be
	EXPECT_EQ(take(session("s/t", nullptr, l)), "<null>");
	EXPECT_EQ(vyrl_ucnt(l.get()), 1);
}

// Every allocation of a session, vyrlugm_mkdir's included, fails once in
// turn: the call returns NULL and holds on to nothing.  The one attempt
// whose session path's obstack gets no memory ends in the obstack failure
// handler, which in a real program does not come back: what the call held
// then is abandoned, not leaked (LSan is paused; valgrind would count it).
TEST_F(SessionDir, SessionReleasesEverythingOnFailure)
{
	if (RUNNING_ON_VALGRIND)
		GTEST_SKIP() << "abandons memory on purpose when the obstack failure handler jumps out";
	Label l = make_label(2, 1, 0x5, 0);
	long nulls = 0, aborted_runs = 0;
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		bool aborted = false;
#if defined(__SANITIZE_ADDRESS__)
		__lsan_disable();
#endif
		char *s = inj.run([&] { return vyr_test::obstack_guarded([&] { return session("s", "home", l); }, &aborted); });
#if defined(__SANITIZE_ADDRESS__)
		__lsan_enable();
#endif
		if (!inj.fired()) {
			EXPECT_FALSE(aborted);
			EXPECT_EQ(take(s), base_ + "/s/l2i1c0x5t0x0");
		} else if (aborted) {
			++aborted_runs;
			vyr_test::FailAlloc::reset(); // forget what the call abandoned
		} else {
			nulls += s == nullptr;
			std::free(s); // a link that could not be formed is no failure
		}
	});
	EXPECT_EQ(aborted_runs, 1);
	EXPECT_GE(nulls, 3);
	EXPECT_EQ(fields(l.get()), Fields(2, 1, 0x5, 0));
}

} // namespace
