// Nobody may point the library at code, labels or databases of their own
// choosing: through the environment of a set-ID program, or a configuration
// naming places outside the intended directories.
#include "hardening/files_db.hh"

#include <vyr/namedb.h>

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>

#ifndef VYR_ENV_PROBE
#error "VYR_ENV_PROBE must name the probe program"
#endif

namespace hardening {
namespace {

// A plain copy of the probe obeys the overrides (so the test can fail); set-ID
// copies owned by nobody / nogroup (made by root) must not.
TEST(Trust, SetIdProgramsIgnoreOverridesThatPlainOnesObey)
{
	vyr_test::ScratchDir dir;
	ASSERT_TRUE(dir.ok());
	ASSERT_EQ(::chmod(dir.path().c_str(), 0755), 0); // the set-ID copies run as nobody
	install_file(dir / "evil.conf", "lev_backend = evil\n");
	::setenv("VYR_DBROUTE_CONF", (dir / "evil.conf").c_str(), 1);
	::setenv("VYR_TAVREL_XATTR_NS", "no-such-namespace", 1);
	::setenv("VYR_TAVREL_STATE_DIR", "relative/state", 1);
	const struct {
		const char *name;
		uid_t uid;
		gid_t gid;
		mode_t mode;
	} cases[] = {{"plain", 0, 0, 0755}, {"setuid", 65534, 0, 04755}, {"setgid", 0, 65534, 02755}};
	for (const auto &c : cases) {
		SCOPED_TRACE(c.name);
		if (c.mode != 0755 && ::geteuid() != 0)
			GTEST_SKIP() << "needs root to make set-ID copies owned by nobody";
		const std::string probe = dir / c.name;
		std::filesystem::copy_file(VYR_ENV_PROBE, probe);
		ASSERT_EQ(::chown(probe.c_str(), c.uid, c.gid), 0);
		ASSERT_EQ(::chmod(probe.c_str(), c.mode), 0); // after chown, which clears set-ID bits
		std::string out(512, '\0');
		FILE *p = ::popen(probe.c_str(), "r");
		ASSERT_NE(p, nullptr);
		out.resize(std::fread(out.data(), 1, out.size(), p));
		::pclose(p);
		if (c.mode == 0755) {
			// The refused namespace keeps the channel shut.
			EXPECT_EQ(out, "secure=0 dbroute=0 lev_backend=evil tavrel_open=-1 errno=22\n");
			continue;
		}
		if (out.rfind("secure=0", 0) == 0)
			GTEST_SKIP() << dir.path() << " ignores set-ID bits (nosuid?): " << out;
		// The installed configuration (or none) and the built-in store.
		EXPECT_EQ(out.rfind("secure=1 ", 0), 0u) << out;
		EXPECT_EQ(out.find("lev_backend=evil"), std::string::npos) << out;
		EXPECT_NE(out.find("tavrel_open=0 errno=0"), std::string::npos) << out;
	}
}

// A back-end name (part of a plug-in file name) holding '/', or a relative
// files_dir: refused with a message naming file and line, no database starts.
TEST(Trust, NamesThatReachElsewhereAreRefused)
{
	const struct {
		const char *conf;
		int line;
	} cases[] = {
		{"lev_backend = ../../tmp/evil\n", 1},
		{"lev_backend = /tmp/evil\n", 1},
		{"lev_charset = UTF-8\nlev_backend = files/../../evil\n", 2},
		{"lev_backend = files\nfiles_dir = ./db\n", 2},
	};
	vyr_test::ScratchDir dir;
	ASSERT_TRUE(dir.ok());
	const std::string conf = dir / "dbroute.conf";
	::setenv("VYR_DBROUTE_CONF", conf.c_str(), 1);
	for (const auto &c : cases) {
		SCOPED_TRACE(c.conf);
		install_file(conf, c.conf);
		::testing::internal::CaptureStderr();
		errno = 0;
		EXPECT_EQ(openlevdb_r(), nullptr); // a failed start is tried again on the next call
		EXPECT_EQ(errno, EINVAL);
		const std::string said = ::testing::internal::GetCapturedStderr();
		EXPECT_EQ(said.rfind("dbroute: " + conf + ":" + std::to_string(c.line) + ": ", 0), 0u) << said;
	}
}

} // namespace
} // namespace hardening
