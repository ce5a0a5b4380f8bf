// End-to-end tests of the installed `vyr`, run in a private world: its own databases, process label store and
// tree (tree/{d/{x, y}, f, l -> ../db}), the tool's working directory.  Labels live in user.* attributes.
#include "support/scratch_dir.hh"

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <filesystem>
#include <fstream>
#include <iterator>

#include <fcntl.h>
#include <grp.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>
#include <valgrind/valgrind.h>

namespace {

using Args = std::vector<std::string>;
using Json = nlohmann::json;

struct Result { int status; std::string out, err; }; // status: exit status, or 128 + signal number

// One run of vyr and all it must give back; as_nobody runs it as uid 65534.
struct Step { Args args; int status; std::string out, err = {}, in = {}; bool as_nobody = false; };

// Under valgrind the child is traced too, and its valgrind, no longer root, can't write its log.
bool other_user_ok() { return geteuid() == 0 && !RUNNING_ON_VALGRIND; }

class ToolTest : public ::testing::Test {
protected:
	void SetUp() override
	{
		if (access(tool_.c_str(), X_OK) != 0)
			GTEST_SKIP() << "installed vyr not found (set VYR_TOOL_PREFIX)";
		ASSERT_TRUE(dir_.ok() && chmod(dir_.path().c_str(), 0755) == 0); // others must reach the tree
		for (const char *d : {"db", "tree", "tree/d"})
			ASSERT_EQ(mkdir(path(d).c_str(), 0755), 0);
		for (const char *f : {"tree/d/y", "tree/d/x", "tree/f"})
			std::ofstream(path(f)) << f;
		ASSERT_EQ(symlink("../db", path("tree/l").c_str()), 0);
		std::ofstream(conf_) << "mac_backend = files\nlev_backend = files\ncat_backend = files\nfiles_dir = "
		                     << path("db") << "\n";
		std::ofstream(path("db/levels")) << "Unclassified:0\nConfidential:1\nSecret:2\nTopSecret:3\n";
		std::ofstream(path("db/categories")) << "finance:1\nhr:2\nops:4\n";
		std::ofstream(path("db/users")) << "alice:2:3:0:0\nbob:1:1:0:0\n";
		setenv("VYR_DBROUTE_CONF", conf_.c_str(), 1); // vyr inherits these
		setenv("VYR_TAVREL_XATTR_NS", "user", 1);
		setenv("VYR_TAVREL_STATE_DIR", path("state").c_str(), 1);
		const Result probe = vyr({"set", "0", "tree/f"});
		if (probe.err.find("not supported") != std::string::npos)
			GTEST_SKIP() << "no user.* extended attributes under " << dir_.path() << "; set TMPDIR";
		ASSERT_EQ(probe.status, 0) << probe.err;
	}

	// Runs the installed vyr in the world; its standard streams are files there.
	Result vyr(const Args &args, const std::string &input = {}, bool as_nobody = false) const
	{
		std::vector<char *> argv{const_cast<char *>(tool_.c_str())};
		for (const auto &a : args)
			argv.push_back(const_cast<char *>(a.c_str()));
		argv.push_back(nullptr);
		std::ofstream(path("stdin"), std::ios::binary) << input;
		const pid_t pid = fork();
		if (pid == 0) {
			for (const int fd : {0, 1, 2}) {
				const char *names[] = {"stdin", "stdout", "stderr"};
				const int f = open(path(names[fd]).c_str(), fd == 0 ? O_RDONLY : O_WRONLY | O_CREAT | O_TRUNC, 0644);
				dup2(f, fd), close(f);
			}
			if (chdir(dir_.path().c_str()) == 0 &&
			    (!as_nobody || (setgroups(0, nullptr) == 0 && setgid(65534) == 0 && setuid(65534) == 0)))
				execv(argv[0], argv.data());
			_exit(125);
		}
		int ws = 0;
		waitpid(pid, &ws, 0);
		return {WIFEXITED(ws) ? WEXITSTATUS(ws) : 128 + WTERMSIG(ws), slurp("stdout"), slurp("stderr")};
	}

	std::string slurp(const char *name) const
	{
		return {std::istreambuf_iterator<char>(std::ifstream(path(name)).rdbuf()), {}};
	}

	void run(const std::vector<Step> &steps) const
	{
		for (const auto &s : steps) {
			const Result r = vyr(s.args, s.in, s.as_nobody);
			EXPECT_TRUE(r.status == s.status && r.out == s.out && r.err == s.err)
			    << testing::PrintToString(s.args) << " gave " << r.status << ":\n" << r.out << r.err << "instead of "
			    << s.status << ":\n" << s.out << s.err;
		}
	}

	Json vyr_json(const Args &args, int expect_status = 0) const
	{
		const Result r = vyr(args);
		EXPECT_EQ(r.status, expect_status) << r.err;
		return Json::parse(r.out); // not JSON: the exception fails the test
	}

	std::string path(const std::string &rel) const { return dir_ / rel; }

	const char *prefix_ = std::getenv("VYR_TOOL_PREFIX"); // where tools.install put the build
	const std::string tool_ = std::string(prefix_ ? prefix_ : "") + "/bin/vyr";
	vyr_test::ScratchDir dir_;
	const std::string conf_ = path("dbroute.conf");
};

// Help and version; a usage error names itself on stderr, points at --help, prints nothing on stdout and exits 2;
// so does a label text that doesn't read, named by every command that reads labels, never read as the zero label.
TEST_F(ToolTest, HelpAndUsageErrors)
{
	EXPECT_EQ(vyr({"--version"}).out, "vyr 2.0.0 (libvyr.so.2)\n");
	const std::string help = vyr({"--help"}).out;
	for (const char *cmd : {"get", "set", "id", "run", "check", "raw", "lev", "cat", "user", "session-dir"}) {
		const Result r = vyr({cmd, "--help"});
		EXPECT_TRUE(r.status == 0 && r.err.empty() && r.out.rfind(std::string("Usage: vyr ") + cmd, 0) == 0 &&
		            r.out.find("--json") != std::string::npos && vyr({cmd, "-h"}).out == r.out &&
		            vyr({"help", cmd}).out == r.out && help.find(std::string("  vyr ") + cmd) != std::string::npos)
		    << cmd << ": " << r.out << r.err;
	}
	const std::pair<Args, std::string> cases[] = {
	    {{}, "no command given"},
	    {{"--bogus"}, "unknown option '--bogus'"},
	    {{"get", "-x", "x"}, "unknown option '-x'"},
	    {{"get"}, "missing PATH"},
	    {{"set", "Secret"}, "missing PATH"},
	    {{"id", "abc"}, "not a process number"},
	    {{"run", "Secret", "--"}, "missing COMMAND"},
	    {{"check", "Secret", "Secret", "read,"}, "unknown access word ''"},
	    {{"raw", "frob"}, "unknown action 'frob'"},
	    {{"lev", "add", "x", "256"}, "is not 0 to 255"},
	    {{"cat", "add", "x", "3"}, "exactly one bit"},
	    {{"user", "add", "u", "Secret", "0", "Nolevel", "0"}, "unknown level 'Nolevel'"},
	    {{"session-dir", "--mode", "9", "a", "b", "0"}, "mode '9' is not octal"},
	    {{"session-dir", "--owner", "no-such-user:0", "a", "b", "0"}, "is not UID:GID"},
	    {{"session-dir", "--link"}, "needs a value"},
	};
	for (const auto &[args, message] : cases) {
		const Result r = vyr(args);
		EXPECT_TRUE(r.status == 2 && r.out.empty() && r.err.rfind("vyr: ", 0) == 0 &&
		            r.err.find(message) != std::string::npos && r.err.find("--help") != std::string::npos)
		    << testing::PrintToString(args) << " gave " << r.status << ": " << r.err;
	}
	run({
	    {{"set", "Secrt:Low", "tree/f"}, 2, "", "vyr: Secrt:Low: unknown level 'Secrt'\n"},
	    {{"set", "300", "tree/f"}, 2, "", "vyr: 300: level '300' is out of range (0 to 255)\n"},
	    {{"check", "", "0", "read"}, 2, "", "vyr: '': empty label text\n"},
	    {{"raw", "encode", "Secret:Hgh"}, 2, "", "vyr: Secret:Hgh: invalid label text\n"},
	    {{"get", "-n", "tree/f"}, 0, "tree/f\t0:0:0x0:0x0!:\n"},
	});
}

TEST_F(ToolTest, GetAndSetOnATree)
{
	const std::string c = "\t1:0:0x1:0x0!:\n", denied = ": Permission denied\n";
	run({
	    {{"set", "-R", "Confidential:Low:finance", "tree"}, 0, ""},
	    {{"set", "Secret", "tree/d/y"}, 0, ""},
	    // A link itself can't carry a user.* label; without -d the target counts.
	    {{"set", "TopSecret", "tree/l"}, 0, ""},
	    {{"set", "-d", "Secret", "tree/l"}, 1, "", "vyr: tree/l: Operation not permitted\n"},
	    {{"get", "-d", "tree/l", "tree/f"}, 0,
	     "tree/l\tUnclassified:Low:0x0:0x0!No:No\ntree/f\tConfidential:Low:finance:0x0!No:No\n"},
	    // -R walks in name order and never follows a link below the top out of the tree.
	    {{"get", "-R", "-n", "tree"}, 0,
	     "tree" + c + "tree/d" + c + "tree/d/x" + c + "tree/d/y\t2:0:0x0:0x0!:\ntree/f" + c + "tree/l\t3:0:0x0:0x0!:\n"},
	    // A path that fails is reported with status 1; the others are still done.
	    {{"get", "-n", "tree/f", "tree/missing", "tree/d"}, 1, "tree/f" + c + "tree/d" + c,
	     "vyr: tree/missing: No such file or directory\n"},
	});
	if (other_user_ok()) {
		ASSERT_TRUE(chmod(path("tree/d/x").c_str(), 0) == 0 && chmod(path("tree/d").c_str(), 0711) == 0);
		run({
		    {{"get", "tree/d/x"}, 1, "", "vyr: tree/d/x" + denied, "", true},
		    {{"set", "Secret", "tree/f"}, 1, "", "vyr: tree/f" + denied, "", true}, // needs write permission
		    // A directory that can't be read is reported (label, then list); the walk goes on.
		    {{"get", "-n", "-R", "tree"}, 1, "tree" + c + "tree/f" + c + "tree/l\t3:0:0x0:0x0!:\n",
		     "vyr: tree/d" + denied + "vyr: tree/d" + denied, "", true},
		});
	}
	// JSON: every field of a label, for every path of a walk, whatever bytes the path holds.
	std::ofstream(path("tree/d/q\"\\\n\t\x01\xff\xc3\xa9"));
	run({{{"set", "Secret:High:finance,0x10:ccnr,ehole!9,3:2", "tree/d/y"}, 0, ""}, {{"set", "9", "tree/d/x"}, 0, ""}});
	const Json j = vyr_json({"--json", "get", "-R", "tree/d"});
	ASSERT_EQ(j.size(), 4u);
	EXPECT_TRUE(j[0]["path"] == "tree/d" && j[1]["path"] == "tree/d/q\"\\\n\t\x01\xc3\xbf\xc3\xa9" &&
	            j[2]["label"]["lev_name"].is_null()) << j; // a level without a name has none
	EXPECT_EQ(j[3], Json::parse(R"({"path": "tree/d/y", "label": {
	    "text": "Secret:High:finance,0x10:ccnr,ehole!9,3:2", "numeric": "2:1:0x11:0x5!9,3:2",
	    "lev": 2, "lev_name": "Secret", "ilev": 1, "cat": "0x11", "cat_text": "finance,0x10",
	    "type": 5, "type_text": "ccnr,ehole", "blob_size": 0, "roles1": [9, 3], "roles2": [2]}})"));
}

TEST_F(ToolTest, IdShowsTheLabelThatRunSet)
{
	// Without a place to keep process labels, nothing is run.
	std::ofstream(path("state")) << "not a directory";
	const Result r = vyr({"run", "Secret", "--", "/bin/echo", "ran"});
	EXPECT_TRUE(r.status == 1 && r.out.empty() && r.err.rfind("vyr: pid ", 0) == 0) << r.status << r.out << r.err;
	ASSERT_EQ(unlink(path("state").c_str()), 0);
	run({
	    {{"id"}, 0, "Unclassified:Low:0x0:0x0!No:No\n"},
	    {{"run", "Confidential:Low:hr", "--", tool_, "id"}, 0, "Confidential:Low:hr:0x0!No:No\n"},
	    // Without "--" too, and the command's own options are its own.
	    {{"run", "Secret", tool_, "id", "-n"}, 0, "2:0:0x0:0x0!:\n"},
	    {{"run", "Secret", "--", "/bin/sh", "-c", "exit 7"}, 7, ""},
	    {{"id", "2147483647"}, 1, "", "vyr: pid 2147483647: No such process\n"},
	    {{"run", "Secret", "--", "tree/missing"}, 127, "", "vyr: tree/missing: No such file or directory\n"},
	    {{"run", "Secret", "--", "tree/f"}, 126, "", "vyr: tree/f: Permission denied\n"},
	});
	const Json doc = vyr_json({"run", "TopSecret", "--", tool_, "id", "--json"});
	EXPECT_TRUE(doc["pid"].get<int>() > 0 && doc["label"]["lev_name"] == "TopSecret") << doc;
}

// Every access word, each refusing test in the order reported, how the object's ccnr and CCNRA count under
// obj-type (ccnr drops read, ccnri the integrity test), and the roles decision.
TEST_F(ToolTest, CheckDecidesAndNamesWhatRefused)
{
	struct Case { std::string subject, object, access; bool roles; Args refused; }; // "test/access"; none: allowed
	const Case cases[] = {
	    {"Secret:Low:finance", "Secret:Low:finance,hr", "exec", false, {"category/exec"}},
	    {"Secret:Low:finance", "Confidential:Low:finance", "write", false, {"level/write"}},
	    {"Confidential", "Secret:Low:hr", "read,write", false,
	     {"level/read", "category/read", "level/write", "category/write"}},
	    {"Secret:Low:finance", "Secret:High:finance", "write", false, {"integrity/write"}},
	    {"Confidential", "TopSecret:Low:hr", "read,no-lev", false, {"category/read"}},
	    {"Confidential", "TopSecret:High:hr", "read,write,no-lev,no-cat,no-ilev", false, {}},
	    {"Confidential:Low", "Secret:High", "write-up", false, {"integrity/write-up"}},
	    {"Confidential:Low:finance", "Secret:High:finance,hr:ccnr", "read,obj-type", false, {}},
	    {"Confidential:Low:finance", "Secret:High:finance:CCNRA", "read,write,obj-type", false, {"level/write"}},
	    {"Confidential:Low:finance", "Secret:High:finance,hr:ccnr", "read,child,obj-type", false, {"child relation"}},
	    {"Secret!5,3", "Secret!7", "read", true, {"roles"}},
	    {"Confidential!6", "Secret!7", "read", true, {"level/read", "roles"}},
	};
	for (const auto &c : cases) {
		Args args{"check", "--json", c.subject, c.object, c.access};
		if (c.roles)
			args.push_back("--roles");
		const Json doc = vyr_json(args, c.refused.empty() ? 0 : 1);
		Args refused;
		for (const auto &r : doc["refused"])
			refused.push_back(r["test"].get<std::string>() +
			                  (r["access"].is_null() ? "" : "/" + r["access"].get<std::string>()));
		EXPECT_EQ(refused, c.refused) << testing::PrintToString(args);
		EXPECT_EQ(doc["mandatory"], refused.empty() || refused.front() == "roles");
		EXPECT_EQ(doc["roles"].is_boolean(), c.roles);
	}
	// As text, with the compared values by name; labels of paths and processes.
	run({
	    {{"set", "Secret", "tree/f"}, 0, ""},
	    {{"check", "TopSecret:Low:finance", "@tree/f", "read"}, 0, "allowed\n"},
	    {{"check", "--roles", "Secret!6,3", "Secret!7", "read"}, 1, "denied\n  roles: subject 6,3:No, object 7:No\n"},
	    // This test process has no label: the zero label may not read f.
	    {{"check", "@pid:" + std::to_string(getpid()), "@tree/f", "read"}, 1,
	     "denied\n  level refuses read: subject Unclassified, object Secret\n"},
	    {{"check", "Secret", "@tree/missing", "read"}, 1, "", "vyr: tree/missing: No such file or directory\n"},
	    {{"check", "@pid:x", "Secret", "read"}, 2, "", "vyr: x: not a process number\n"},
	});
	const Json doc = vyr_json({"check", "--json", "Confidential:Low:finance", "@tree/f", "read,exec"}, 1);
	const Json exec = Json::parse(R"({"test": "level", "access": "exec", "subject": "Confidential", "object": "Secret"})");
	EXPECT_TRUE(doc["refused"][1] == exec && doc["allowed"] == false && doc["request"] == Json::array({"read", "exec"}) &&
	            doc["request_word"] == 5 && doc["object"]["lev"] == 2) << doc;
}

TEST_F(ToolTest, RawEncodeAndDecode)
{
	// version 1, type 0, lev 1, ilev 0, cat 1, no blob, no roles
	const std::string hex = "0100" "0000" "01" "00" "0100000000000000" "00000000" "00000000" "00000000";
	const std::string bytes = vyr({"raw", "encode", "Secret:High:finance,hr:ccnr!9,3:2"}).out;
	const std::string whole = "vyr: standard input: not a whole-label raw form";
	run({
	    {{"raw", "encode", "--hex", "Confidential:Low:finance"}, 0, hex + "\n"},
	    {{"raw", "decode", "--hex"}, 0, "Confidential:Low:finance:0x0!No:No\n", "", hex + "\n"},
	    {{"raw", "decode"}, 0, "Secret:High:finance,hr:ccnr!9,3:2\n", "", bytes},
	    {{"raw", "decode", "-n"}, 0, "2:1:0x3:0x1!9,3:2\n", "", bytes},
	    {{"raw", "decode"}, 1, "", whole + " (0 bytes)\n"},
	    {{"raw", "decode"}, 1, "", whole + " (" + std::to_string(bytes.size() + 1) + " bytes)\n", bytes + "x"},
	    {{"raw", "decode"}, 1, "", whole + "\n", std::string("\x02\x00", 2) + bytes.substr(2)}, // version 2
	    {{"raw", "decode", "--hex"}, 1, "", "vyr: standard input: not hexadecimal text\n", "01zz"},
	});
	EXPECT_EQ(vyr_json({"raw", "encode", "--json", "1:0:0x1"}), (Json{{"size", 26}, {"hex", hex}}));
	EXPECT_EQ(Json::parse(vyr({"raw", "decode", "--json"}, bytes).out)["numeric"], "2:1:0x3:0x1!9,3:2");
}

TEST_F(ToolTest, TheThreeDatabasesAndTheirFailures)
{
	run({
	    {{"lev", "add", "Restricted", "5"}, 0, ""},
	    {{"lev", "rm", "TopSecret"}, 0, ""}, // by name
	    {{"lev", "list"}, 0, "Unclassified\t0\nConfidential\t1\nSecret\t2\nRestricted\t5\n"},
	    {{"lev", "rm", "5"}, 0, ""}, // by value
	    {{"lev", "get", "Restricted"}, 1, "", "vyr: level 'Restricted': no such entry\n"},
	    {{"lev", "add", "has:colon", "7"}, 1, "", "vyr: level 'has:colon': Invalid argument\n"}, // the back-end's refusal
	    {{"cat", "add", "top", "8000000000000000"}, 0, ""},
	    {{"cat", "list"}, 0, "finance\t0x1\nhr\t0x2\nops\t0x4\ntop\t0x8000000000000000\n"},
	    {{"cat", "rm", "0x8000000000000000"}, 0, ""},
	    {{"cat", "get", "top"}, 1, "", "vyr: category 'top': no such entry\n"},
	    {{"user", "add", "carol", "Secret", "finance,ops", "1", "0x2"}, 0, ""},
	    {{"user", "get", "carol"}, 0, "carol\tSecret:finance,ops\tConfidential:hr\n"},
	    {{"user", "add", "carol", "0", "0", "0", "0"}, 0, ""}, // replaces the entry
	    {{"user", "list", "-n"}, 0, "alice\t2:0x3\t0:0x0\nbob\t1:0x1\t0:0x0\ncarol\t0:0x0\t0:0x0\n"},
	    {{"user", "rm", "carol"}, 0, ""},
	});
	EXPECT_EQ(vyr_json({"lev", "get", "--json", "Confidential"}), (Json{{"name", "Confidential"}, {"value", 1}}));
	EXPECT_EQ(vyr_json({"cat", "get", "--json", "ops"}), (Json{{"name", "ops"}, {"value", "0x4"}}));
	EXPECT_EQ(vyr_json({"user", "list", "--json"})[0], Json::parse(R"({"name": "alice",
	    "lev1": 2, "lev1_text": "Secret", "cat1": "0x3", "cat1_text": "finance,hr",
	    "lev2": 0, "lev2_text": "Unclassified", "cat2": "0x0", "cat2_text": "0x0"})"));
	// Without the databases, labels are shown in numbers and names can't be read.
	std::ofstream(conf_) << "lev_backend = files\ncat_backend = files\nmac_backend = files\nfiles_dir = "
	                     << path("no-such-dir") << "\n";
	run({
	    {{"lev", "list"}, 1, "", "vyr: level database: No such file or directory\n"},
	    {{"set", "2:1:0x3", "tree/f"}, 0, ""},
	    {{"get", "tree/f"}, 0, "tree/f\t2:1:0x3:0x0!:\n"},
	    {{"set", "Secret", "tree/f"}, 1, "",
	     "vyr: Secret: level 'Secret' needs the level database: No such file or directory\n"},
	});
}

// A session directory is made with the owner, mode and link asked for; as JSON, without links, with an empty SUB.
TEST_F(ToolTest, SessionDirIsMadeAsAsked)
{
	const std::string base = path("tree"), dir = base + "/s/l2i0c0x1t0x0";
	EXPECT_EQ(vyr_json({"session-dir", "--json", base, "", "Confidential"})["path"], base + "//l1i0c0x0t0x0");
	run({{{"session-dir", "--link", "home", "--mode", "0750", "--owner", "65534:65534", base, "s", "Secret:Low:finance"},
	      0, dir + "\n"},
	     {{"session-dir", "tree/missing", "s", "Secret"}, 1, "", "vyr: tree/missing/s: No such file or directory\n"}});
	struct stat st = {};
	EXPECT_TRUE(stat(dir.c_str(), &st) == 0 && (st.st_mode & 07777) == 0750 &&
	            st.st_gid == (geteuid() ? getegid() : 65534));
	EXPECT_EQ(std::filesystem::read_symlink(dir + "/home"), base + "/s");
}

} // namespace
