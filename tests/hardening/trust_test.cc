// Environment overrides of the platform libraries (VYR_DBROUTE_CONF,
// VYR_TAVREL_XATTR_NS, VYR_TAVREL_STATE_DIR) must not reach set-user-ID or
// set-group-ID programs: otherwise whoever runs such a program could point
// it at a configuration (and so at plug-ins and label stores) of their own.
//
// A probe program is run three ways with all three variables set: plainly
// (it must obey them, which shows the test can fail), as a set-user-ID copy
// owned by nobody, and as a set-group-ID copy of group nogroup. The last two
// need root (to chown) and a file system that honours the set-ID bits.
#include "hardening/files_db.hh"
#include "support/scratch_dir.hh"

#include <vyr/namedb.h>

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <string>

#ifndef VYR_ENV_PROBE
#error "VYR_ENV_PROBE must name the probe program"
#endif

namespace hardening {
namespace {

constexpr uid_t kNobody = 65534;
constexpr gid_t kNogroup = 65534;

std::string run(const std::string &program)
{
	std::string out;
	FILE *p = ::popen(program.c_str(), "r");
	if (p == nullptr)
		return "popen failed";
	char buf[512];
	while (std::fgets(buf, sizeof buf, p) != nullptr)
		out += buf;
	::pclose(p);
	return out;
}

class Trust : public ::testing::Test {
protected:
	void SetUp() override
	{
		ASSERT_TRUE(scratch_.ok());
		dir_ = scratch_.path();
		ASSERT_EQ(::chmod(dir_.c_str(), 0755), 0); // the set-ID copies run as nobody
		install_file(dir_ + "/evil.conf", "lev_backend = evil\n");
		::setenv("VYR_DBROUTE_CONF", (dir_ + "/evil.conf").c_str(), 1);
		::setenv("VYR_TAVREL_XATTR_NS", "no-such-namespace", 1);
		::setenv("VYR_TAVREL_STATE_DIR", "relative/state", 1);
	}
	void TearDown() override
	{
		for (const char *v : {"VYR_DBROUTE_CONF", "VYR_TAVREL_XATTR_NS", "VYR_TAVREL_STATE_DIR"})
			::unsetenv(v);
	}

	// A copy of the probe with the given owner, group and mode.
	std::string copy_probe(const char *name, uid_t uid, gid_t gid, mode_t mode)
	{
		const std::string path = dir_ + "/" + name;
		std::error_code err;
		std::filesystem::copy_file(VYR_ENV_PROBE, path, err);
		EXPECT_FALSE(err) << err.message();
		EXPECT_EQ(::chown(path.c_str(), uid, gid), 0);
		EXPECT_EQ(::chmod(path.c_str(), mode), 0); // after chown, which clears set-ID bits
		return path;
	}

	vyr_test::ScratchDir scratch_;
	std::string dir_;
};

TEST_F(Trust, PlainProgramObeysTheOverrides)
{
	// The namespace is refused, so the channel does not open: proof that the
	// variables were read. The configuration file named is the one loaded.
	EXPECT_EQ(run(copy_probe("plain", 0, 0, 0755)), "secure=0 dbroute=0 lev_backend=evil tavrel_open=-1 errno=22\n");
}

TEST_F(Trust, SetIdProgramsIgnoreTheOverrides)
{
	if (::geteuid() != 0)
		GTEST_SKIP() << "needs root to make set-user-ID and set-group-ID copies owned by nobody";
	struct Case {
		const char *name;
		uid_t uid;
		gid_t gid;
		mode_t mode;
	} cases[] = {
		{"setuid", kNobody, 0, 04755},
		{"setgid", 0, kNogroup, 02755},
	};
	for (const Case &c : cases) {
		SCOPED_TRACE(c.name);
		const std::string out = run(copy_probe(c.name, c.uid, c.gid, c.mode));
		if (out.rfind("secure=0", 0) == 0)
			GTEST_SKIP() << dir_ << " ignores set-ID bits (nosuid?): " << out;
		// The installed configuration is read instead (it may be missing,
		// then dbroute_init fails), and the channel opens with the built-in
		// namespace and state directory.
		EXPECT_EQ(out.rfind("secure=1 ", 0), 0u) << out;
		EXPECT_EQ(out.find("lev_backend=evil"), std::string::npos) << out;
		EXPECT_NE(out.find("tavrel_open=0 errno=0"), std::string::npos) << out;
	}
}

// Configuration that would make the library load code, or read databases,
// from a place of someone's choosing: a back-end name is part of a plug-in
// file name and may hold no '/', and the files back-end's directory must be
// absolute. The configuration library refuses such a file with a message
// naming file and line, and the database does not start.
TEST(TrustConfig, NamesThatReachElsewhereAreRefused)
{
	struct Case {
		const char *conf;
		int line;
	} cases[] = {
		{"lev_backend = ../../tmp/evil\n", 1},
		{"lev_backend = /tmp/evil\n", 1},
		{"lev_charset = UTF-8\nlev_backend = files/../../evil\n", 2},
		{"lev_backend = files\nfiles_dir = relative/db\n", 2},
		{"lev_backend = files\nfiles_dir = ./db\n", 2},
	};
	vyr_test::ScratchDir scratch;
	ASSERT_TRUE(scratch.ok());
	const std::string conf = scratch / "dbroute.conf", err_file = scratch / "stderr";
	for (const Case &c : cases) {
		SCOPED_TRACE(c.conf);
		install_file(conf, c.conf);
		// A child of its own: a database that started stays started.
		const pid_t pid = ::fork();
		ASSERT_GE(pid, 0);
		if (pid == 0) {
			const int fd = ::open(err_file.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
			if (fd < 0 || ::dup2(fd, STDERR_FILENO) < 0)
				::_exit(2);
			::setenv("VYR_DBROUTE_CONF", conf.c_str(), 1);
			errno = 0;
			void *db = openlevdb_r();
			::_exit(db == nullptr && errno == EINVAL ? 0 : 1);
		}
		int status = 0;
		ASSERT_EQ(::waitpid(pid, &status, 0), pid);
		EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << "the database started, or another errno";
		const std::string said = read_file(err_file);
		EXPECT_EQ(said.rfind("dbroute: " + conf + ":" + std::to_string(c.line) + ": ", 0), 0u) << said;
	}
}

} // namespace
} // namespace hardening
