// Each allocation of a `vyr` command fails once in turn, in-process under the failing allocator: the command must
// then fail or get by without that memory, never crash, and release everything it got.
#include "support/failalloc.h"
#include "support/scratch_dir.hh"

#include "commands.hh"

#include <cstdio>
#include <cstdlib>
#include <fstream>

#include <fcntl.h>
#include <sys/wait.h>
#include <sys/xattr.h>
#include <unistd.h>
#include <valgrind/valgrind.h>

namespace {

// What an attempt reports: kLeaked, or kFailed or kRanThrough plus the command's status.
enum : int { kLeaked = 10, kFailed = 20, kRanThrough = 30 };

// Runs the command twice in a child (out of memory in the label text writer ends the process): the first run
// starts the databases and the service channel, which live as long as the process; in the second the n-th
// allocation fails.
int attempt(std::vector<char *> &argv, long n)
{
	const pid_t pid = fork();
	if (pid == 0) {
		const int null = open("/dev/null", O_WRONLY), argc = static_cast<int>(argv.size()) - 1;
		dup2(null, STDOUT_FILENO), dup2(null, STDERR_FILENO);
		vyr::tool::tool_main(argc, argv.data());
		std::fflush(nullptr);
		vyr_test::FailAlloc::reset();
		vyr_test::Injector inj(n);
		const int status = inj.run([&] { return vyr::tool::tool_main(argc, argv.data()); });
		_exit(vyr_test::FailAlloc::live() != 0 ? kLeaked : (inj.fired() ? kFailed : kRanThrough) + status);
	}
	int ws = 0;
	waitpid(pid, &ws, 0);
	return WIFEXITED(ws) ? WEXITSTATUS(ws) : 128 + WTERMSIG(ws);
}

TEST(ToolAllocTest, CommandsReleaseEverythingWhenMemoryRunsOut)
{
	if (RUNNING_ON_VALGRIND)
		GTEST_SKIP() << "hundreds of forked attempts are too slow under valgrind; the sanitizer build runs them";
	const vyr_test::ScratchDir dir;
	const std::string f = dir / "f";
	ASSERT_TRUE(dir.ok());
	std::ofstream(dir / "conf") << "lev_backend = files\ncat_backend = files\nmac_backend = files\nfiles_dir = "
	                            << dir.path() << "\n";
	std::ofstream(dir / "levels") << "Unclassified:0\nConfidential:1\nSecret:2\n";
	std::ofstream(dir / "categories") << "finance:1\nhr:2\n";
	std::ofstream(dir / "users") << "alice:2:3:0:0\n";
	std::ofstream(f) << "f";
	if (setxattr(f.c_str(), "user.probe", "", 0, 0) != 0)
		GTEST_SKIP() << "no user.* extended attributes under " << dir.path() << "; set TMPDIR";
	setenv("VYR_DBROUTE_CONF", (dir / "conf").c_str(), 1);
	setenv("VYR_TAVREL_XATTR_NS", "user", 1);
	setenv("VYR_TAVREL_STATE_DIR", (dir / "state").c_str(), 1);
	// Each command with its status when memory suffices; denials run the code that names the refusing tests.
	const std::pair<std::vector<std::string>, int> commands[] = {
	    {{"set", "Confidential:Low:hr!9,3:2", f}, 0}, // first: the others read this label
	    {{"get", f}, 0},
	    {{"get", "-R", "--json", dir.path()}, 0},
	    {{"check", "Unclassified:Low:finance!7", "@" + f, "read,write", "--roles"}, 1},
	    {{"check", "--json", "Secret:Low:finance!9", "@" + f, "write"}, 1},
	    {{"check", "Secret", "@" + f, "child,obj-type"}, 1},
	    {{"raw", "encode", "--hex", "Secret:High:finance,hr:ccnr!9,3:2"}, 0},
	    {{"lev", "list", "--json"}, 0},
	    {{"cat", "get", "hr"}, 0},
	    {{"user", "list"}, 0},
	    {{"id", "--json"}, 0},
	};
	for (const auto &[words, expected] : commands) {
		SCOPED_TRACE(testing::PrintToString(words));
		std::vector<char *> argv{const_cast<char *>("vyr")};
		for (const auto &w : words)
			argv.push_back(const_cast<char *>(w.c_str()));
		argv.push_back(nullptr);
		long n = 1, r;
		for (; (r = attempt(argv, n)) < kRanThrough || r >= 128; ++n)
			ASSERT_TRUE(r == 1 || r == kFailed || r == kFailed + 1)
			    << "allocation " << n << " failed: child status " << r << (r == kLeaked ? " (blocks leaked)" : "");
		EXPECT_EQ(r, kRanThrough + expected);
		EXPECT_GT(n, 1); // the command does allocate
	}
}

} // namespace
