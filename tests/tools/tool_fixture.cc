#include "tool_fixture.hh"

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <stdexcept>

#include <grp.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>
#include <valgrind/valgrind.h>

namespace vyr_tool_test {

namespace {

// The child's standard streams are in-memory files: nothing to pump while
// it runs, and nothing left on disk.
int memory_file(const std::string &content)
{
	const int fd = memfd_create("vyr-tool-test", MFD_CLOEXEC);
	if (fd < 0 || write(fd, content.data(), content.size()) != static_cast<ssize_t>(content.size()) ||
	    lseek(fd, 0, SEEK_SET) != 0)
		throw std::runtime_error("memfd_create failed");
	return fd;
}

std::string contents(int fd)
{
	std::string s;
	char buf[4096];
	ssize_t n;
	lseek(fd, 0, SEEK_SET);
	while ((n = read(fd, buf, sizeof buf)) > 0)
		s.append(buf, static_cast<size_t>(n));
	close(fd);
	return s;
}

} // namespace

std::string ToolTest::installed_vyr()
{
	const char *prefix = std::getenv("VYR_TOOL_PREFIX");
	return std::string(prefix ? prefix : "") + "/bin/vyr";
}

const char *ToolTest::no_other_user()
{
	if (geteuid() != 0)
		return "needs root to run the tool as another user (uid 65534)";
	// Under valgrind the child is traced too, and its valgrind, no longer
	// root, can't create its log file where the test runner asked for it.
	if (RUNNING_ON_VALGRIND)
		return "valgrind can't follow the tool into another user";
	return nullptr;
}

void ToolTest::SetUp()
{
	if (access(installed_vyr().c_str(), X_OK) != 0)
		GTEST_SKIP() << "installed vyr not found (set VYR_TOOL_PREFIX)";
	ASSERT_TRUE(dir_.ok());
	// Other users must reach the tree for the permission tests.
	ASSERT_EQ(chmod(dir_.path().c_str(), 0755), 0);
	ASSERT_EQ(mkdir(path("db").c_str(), 0755), 0);
	ASSERT_EQ(mkdir(path("tree").c_str(), 0755), 0);
	std::ofstream(conf_) << "mac_backend = files\nlev_backend = files\ncat_backend = files\nfiles_dir = "
	                     << path("db") << "\n";
	std::ofstream(path("db/levels")) << "Unclassified:0\nConfidential:1\nSecret:2\nTopSecret:3\n";
	std::ofstream(path("db/categories")) << "finance:1\nhr:2\nops:4\n";
	std::ofstream(path("db/users")) << "alice:2:3:0:0\nbob:1:1:0:0\n";

	// The labels live in extended attributes of the user namespace; a file
	// system without them can't run these tests.
	const Result probe = vyr({"set", "1", file("probe")});
	if (probe.status != 0 && probe.err.find("not supported") != std::string::npos)
		GTEST_SKIP() << "no user.* extended attributes under " << dir_.path() << "; set TMPDIR";
	ASSERT_EQ(probe.status, 0) << probe.err;
	ASSERT_EQ(::unlink(path("tree/probe").c_str()), 0);
}

Result ToolTest::vyr(const std::vector<std::string> &args, const std::string &input, bool as_nobody,
                     const std::vector<std::string> &env) const
{
	const std::string program = installed_vyr();
	std::vector<std::string> vars{"VYR_DBROUTE_CONF=" + conf_, "VYR_TAVREL_XATTR_NS=user",
	                              "VYR_TAVREL_STATE_DIR=" + path("state"), "LC_ALL=C"};
	vars.insert(vars.end(), env.begin(), env.end());
	std::vector<char *> argv{const_cast<char *>(program.c_str())};
	for (const auto &a : args)
		argv.push_back(const_cast<char *>(a.c_str()));
	argv.push_back(nullptr);
	const int in = memory_file(input), out = memory_file({}), err = memory_file({});
	const pid_t pid = fork();
	if (pid == 0) {
		dup2(in, STDIN_FILENO);
		dup2(out, STDOUT_FILENO);
		dup2(err, STDERR_FILENO);
		for (auto &v : vars)
			putenv(v.data());
		if (as_nobody && (setgroups(0, nullptr) != 0 || setgid(65534) != 0 || setuid(65534) != 0))
			_exit(125);
		execv(program.c_str(), argv.data());
		std::fprintf(stderr, "exec %s: %s\n", program.c_str(), std::strerror(errno));
		_exit(124);
	}
	int ws = 0;
	waitpid(pid, &ws, 0);
	close(in);
	return {WIFEXITED(ws) ? WEXITSTATUS(ws) : 128 + WTERMSIG(ws), contents(out), contents(err)};
}

nlohmann::json ToolTest::vyr_json(const std::vector<std::string> &args, int expect_status) const
{
	const Result r = vyr(args);
	EXPECT_EQ(r.status, expect_status) << r.err;
	const nlohmann::json j = nlohmann::json::parse(r.out, nullptr, false);
	EXPECT_FALSE(j.is_discarded()) << "not JSON: " << r.out;
	return j;
}

std::string ToolTest::label_of(const std::string &p, bool numeric) const
{
	const Result r = numeric ? vyr({"get", "-n", p}) : vyr({"get", p});
	EXPECT_EQ(r.status, 0) << r.err;
	EXPECT_EQ(r.out.rfind(p + "\t", 0), 0u) << r.out;
	return r.out.size() > p.size() + 1 ? r.out.substr(p.size() + 1, r.out.size() - p.size() - 2) : "";
}

} // namespace vyr_tool_test
