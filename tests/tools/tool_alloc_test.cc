// The commands of `vyr` run in-process under the failing allocator: every
// allocation of a command fails once in turn, and the command must then end
// with a failure status (or get by without that memory), never crash, and
// release everything it got.
#include "support/failalloc.h"
#include "support/scratch_dir.hh"

#include "commands.hh"

#include <cstdlib>
#include <cstring>
#include <fstream>
#include <string>
#include <vector>

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>
#include <valgrind/valgrind.h>

namespace vyr_tool_test {
namespace {

// A command line held ready, so that running it allocates nothing of the
// test's own.  Its output goes to /dev/null.
class CommandLine {
public:
	explicit CommandLine(const std::vector<std::string> &words) : words_{"vyr"}
	{
		words_.insert(words_.end(), words.begin(), words.end());
		for (auto &w : words_)
			argv_.push_back(w.data());
		argv_.push_back(nullptr);
	}

	int run_quietly()
	{
		std::fflush(stdout);
		std::fflush(stderr);
		const int out = dup(STDOUT_FILENO), err = dup(STDERR_FILENO), null = open("/dev/null", O_WRONLY);
		dup2(null, STDOUT_FILENO);
		dup2(null, STDERR_FILENO);
		close(null);
		const int status = vyr::tool::tool_main(static_cast<int>(words_.size()), argv_.data());
		std::fflush(stdout);
		std::fflush(stderr);
		dup2(out, STDOUT_FILENO);
		dup2(err, STDERR_FILENO);
		close(out);
		close(err);
		return status;
	}

private:
	std::vector<std::string> words_;
	std::vector<char *> argv_;
};

// What the child of one attempt reports through its exit status.  A
// failure deep in the label text writer ends the process with status 1
// instead of returning, so each attempt runs in a child of its own.
enum : int { kLeaked = 10, kFailed = 20, kRanThrough = 30 }; // + the command's status

int attempt(CommandLine &line, long n)
{
	const pid_t pid = fork();
	if (pid == 0) {
		vyr_test::FailAlloc::reset();
		vyr_test::Injector inj(n);
		const int status = inj.run([&] { return line.run_quietly(); });
		_exit(vyr_test::FailAlloc::live() != 0 ? kLeaked : (inj.fired() ? kFailed : kRanThrough) + status);
	}
	int ws = 0;
	waitpid(pid, &ws, 0);
	return WIFEXITED(ws) ? WEXITSTATUS(ws) : 128 + WTERMSIG(ws);
}

class ToolAllocTest : public ::testing::Test {
protected:
	void SetUp() override
	{
		ASSERT_TRUE(dir_.ok());
		std::ofstream(dir_ / "conf") << "lev_backend = files\ncat_backend = files\nmac_backend = files\nfiles_dir = "
		                             << dir_.path() << "\n";
		std::ofstream(dir_ / "levels") << "Unclassified:0\nConfidential:1\nSecret:2\n";
		std::ofstream(dir_ / "categories") << "finance:1\nhr:2\n";
		std::ofstream(dir_ / "users") << "alice:2:3:0:0\n";
		std::ofstream(dir_ / "f") << "f";
		// The service reads these when it first opens its channel.
		setenv("VYR_DBROUTE_CONF", (dir_ / "conf").c_str(), 1);
		setenv("VYR_TAVREL_XATTR_NS", "user", 1);
		setenv("VYR_TAVREL_STATE_DIR", (dir_ / "state").c_str(), 1);
		status_ = CommandLine({"set", "Secret:Low:finance!9,3:2", dir_ / "f"}).run_quietly();
	}

	// Runs the command once to start the databases and the service channel
	// (state that lives for the process), then once for each of its
	// allocations with that allocation failing.
	void sweep(const std::vector<std::string> &words, int expected)
	{
		SCOPED_TRACE(testing::PrintToString(words));
		CommandLine line(words);
		ASSERT_EQ(line.run_quietly(), expected);
		long n = 1;
		for (; n < 100000; ++n) {
			const int r = attempt(line, n);
			ASSERT_NE(r, kLeaked) << "blocks leaked when allocation " << n << " failed";
			if (r >= kRanThrough) {
				EXPECT_EQ(r, kRanThrough + expected);
				break;
			}
			EXPECT_TRUE(r == 1 || r == kFailed || r == kFailed + 1) << "allocation " << n << ": " << r;
		}
		EXPECT_GT(n, 1); // the command does allocate
	}

	vyr_test::ScratchDir dir_;
	int status_ = -1;
};

TEST_F(ToolAllocTest, CommandsReleaseEverythingWhenMemoryRunsOut)
{
	if (status_ != 0)
		GTEST_SKIP() << "labels can't be set under " << dir_.path() << " (no user.* attributes?)";
	// Hundreds of forked attempts per command are too slow under valgrind;
	// the sanitizer build runs this sweep.
	if (RUNNING_ON_VALGRIND)
		GTEST_SKIP() << "too slow under valgrind; the sanitizer build runs it";
	const std::string f = dir_ / "f";
	// Each command with its status when memory suffices; the denials of
	// `check` (status 1) run the code that names the refusing tests.
	const std::vector<std::pair<std::vector<std::string>, int>> commands = {
	    {{"get", f}, 0},
	    {{"get", "-R", "--json", dir_.path()}, 0},
	    {{"set", "Confidential:Low:hr", f}, 0},
	    {{"check", "Secret:Low:hr", "@" + f, "read"}, 0},
	    {{"check", "Unclassified:Low:finance!7", "@" + f, "read,write", "--roles"}, 1},
	    {{"check", "--json", "Secret:Low:finance!9", "@" + f, "write"}, 1},
	    {{"check", "Secret", "@" + f, "child,obj-type"}, 1},
	    {{"raw", "encode", "--hex", "Secret:High:finance,hr:ccnr!9,3:2"}, 0},
	    {{"lev", "list", "--json"}, 0},
	    {{"cat", "get", "hr"}, 0},
	    {{"user", "list"}, 0},
	    {{"id", "--json"}, 0},
	};
	for (const auto &[words, expected] : commands)
		sweep(words, expected);
}

} // namespace
} // namespace vyr_tool_test
