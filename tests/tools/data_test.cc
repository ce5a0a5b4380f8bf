// raw encode/decode, the three databases, and session directories.
#include "tool_fixture.hh"

#include <climits>
#include <sys/stat.h>
#include <unistd.h>

namespace vyr_tool_test {
namespace {

using Args = std::vector<std::string>;

TEST_F(ToolTest, RawEncodeAndDecode)
{
	// version 1, type 0, lev 1, ilev 0, cat 1, no blob, no roles
	const std::string hex = "0100" "0000" "01" "00" "0100000000000000" "00000000" "00000000" "00000000";
	EXPECT_EQ(vyr({"raw", "encode", "--hex", "Confidential:Low:finance"}).out, hex + "\n");
	const nlohmann::json j = vyr_json({"raw", "encode", "--json", "1:0:0x1"});
	EXPECT_EQ(j["size"], 26);
	EXPECT_EQ(j["hex"], hex);
	EXPECT_EQ(vyr({"raw", "decode", "--hex"}, hex + "\n").out, "Confidential:Low:finance:0x0!No:No\n");

	// Through bytes and back, as named text, numbers and JSON.
	const std::string bytes = vyr({"raw", "encode", "Secret:High:finance,hr:ccnr!9,3:2"}).out;
	EXPECT_EQ(vyr({"raw", "decode"}, bytes).out, "Secret:High:finance,hr:ccnr!9,3:2\n");
	EXPECT_EQ(vyr({"raw", "decode", "-n"}, bytes).out, "2:1:0x3:0x1!9,3:2\n");
	const Result decoded = vyr({"raw", "decode", "--json"}, bytes);
	EXPECT_EQ(nlohmann::json::parse(decoded.out)["numeric"], "2:1:0x3:0x1!9,3:2");
}

TEST_F(ToolTest, RawDecodeRefusesWhatIsNotOneWholeForm)
{
	const std::string ok = vyr({"raw", "encode", "Secret!9"}).out;
	ASSERT_EQ(ok.size(), 39u);
	const std::vector<std::pair<std::string, std::string>> cases = {
	    {"", "not a whole-label raw form (0 bytes)"},
	    {ok.substr(0, 38), "not a whole-label raw form (38 bytes)"},
	    {ok + "x", "not a whole-label raw form (40 bytes)"},
	    {std::string("\x02\x00", 2) + ok.substr(2), "not a whole-label raw form"}, // version 2
	};
	for (const auto &[input, message] : cases) {
		SCOPED_TRACE(input.size());
		const Result r = vyr({"raw", "decode"}, input);
		EXPECT_EQ(r.status, 1);
		EXPECT_EQ(r.err.rfind("vyr: standard input: " + message, 0), 0u) << r.err;
		EXPECT_TRUE(r.out.empty());
	}
	EXPECT_EQ(vyr({"raw", "decode", "--hex"}, "01zz").err, "vyr: standard input: not hexadecimal text\n");
	EXPECT_EQ(vyr({"raw", "decode", "--hex"}, "010").status, 1);
}

TEST_F(ToolTest, LevelDatabase)
{
	EXPECT_EQ(vyr({"lev", "list"}).out, "Unclassified\t0\nConfidential\t1\nSecret\t2\nTopSecret\t3\n");
	EXPECT_EQ(vyr_json({"lev", "list", "--json"})[3], (nlohmann::json{{"name", "TopSecret"}, {"value", 3}}));
	EXPECT_EQ(vyr({"lev", "get", "Secret"}).out, "Secret\t2\n");
	EXPECT_EQ(vyr_json({"lev", "get", "--json", "1"})["name"], "Confidential");

	ASSERT_EQ(vyr({"lev", "add", "Restricted", "5"}).status, 0);
	// A new level name is known to label text too.
	const std::string f = file("f");
	ASSERT_EQ(vyr({"set", "Restricted", f}).status, 0);
	EXPECT_EQ(label_of(f, true), "5:0:0x0:0x0!:");
	ASSERT_EQ(vyr({"lev", "rm", "5"}).status, 0); // by value
	ASSERT_EQ(vyr({"lev", "rm", "TopSecret"}).status, 0);
	EXPECT_EQ(vyr({"lev", "list"}).out, "Unclassified\t0\nConfidential\t1\nSecret\t2\n");

	for (const Args &args : {Args{"lev", "get", "Nope"}, Args{"lev", "rm", "9"}}) {
		const Result r = vyr(args);
		EXPECT_EQ(r.status, 1);
		EXPECT_EQ(r.err, "vyr: level '" + args[2] + "': no such entry\n");
	}
	// The back-end refuses names that would not read back.
	EXPECT_EQ(vyr({"lev", "add", "has:colon", "7"}).err, "vyr: level 'has:colon': Invalid argument\n");
}

TEST_F(ToolTest, CategoryAndUserDatabases)
{
	EXPECT_EQ(vyr({"cat", "list"}).out, "finance\t0x1\nhr\t0x2\nops\t0x4\n");
	ASSERT_EQ(vyr({"cat", "add", "top", "8000000000000000"}).status, 0);
	EXPECT_EQ(vyr({"cat", "get", "2"}).out, "hr\t0x2\n");
	EXPECT_EQ(vyr_json({"cat", "get", "--json", "top"})["value"], "0x8000000000000000");
	ASSERT_EQ(vyr({"cat", "rm", "0x8000000000000000"}).status, 0);
	EXPECT_EQ(vyr({"cat", "get", "top"}).err, "vyr: category 'top': no such entry\n");

	EXPECT_EQ(vyr({"user", "list"}).out,
	          "alice\tSecret:finance,hr\tUnclassified:0x0\nbob\tConfidential:finance\tUnclassified:0x0\n");
	EXPECT_EQ(vyr({"user", "get", "-n", "bob"}).out, "bob\t1:0x1\t0:0x0\n");
	ASSERT_EQ(vyr({"user", "add", "carol", "TopSecret", "finance,ops", "1", "0x2"}).status, 0);
	const nlohmann::json carol = vyr_json({"user", "get", "--json", "carol"});
	EXPECT_EQ(carol["lev1"], 3);
	EXPECT_EQ(carol["cat1"], "0x5");
	EXPECT_EQ(carol["cat1_text"], "finance,ops");
	EXPECT_EQ(carol["cat2_text"], "hr");
	// Replacing keeps one entry.
	ASSERT_EQ(vyr({"user", "add", "carol", "0", "0", "0", "0"}).status, 0);
	const nlohmann::json all = vyr_json({"user", "list", "--json"});
	ASSERT_EQ(all.size(), 3u);
	EXPECT_EQ(all[2]["lev1"], 0);
	ASSERT_EQ(vyr({"user", "rm", "carol"}).status, 0);
	EXPECT_EQ(vyr({"user", "rm", "carol"}).err, "vyr: user 'carol': no such entry\n");
}

TEST_F(ToolTest, DatabaseFailuresAreReported)
{
	// A configuration whose directory does not exist: the databases can't
	// open, and labels are shown in numbers alone.
	std::ofstream(conf_) << "lev_backend = files\ncat_backend = files\nmac_backend = files\nfiles_dir = "
	                     << path("no-such-dir") << "\n";
	for (const char *db : {"lev", "cat", "user"}) {
		SCOPED_TRACE(db);
		const Result r = vyr({db, "list"});
		EXPECT_EQ(r.status, 1);
		EXPECT_NE(r.err.find(" database: No such file or directory"), std::string::npos) << r.err;
	}
	const std::string f = file("f");
	ASSERT_EQ(vyr({"set", "2:1:0x3", f}).status, 0);
	EXPECT_EQ(label_of(f), "2:1:0x3:0x0!:");
	const Result named = vyr({"set", "Secret", f});
	EXPECT_EQ(named.status, 1);
	EXPECT_EQ(named.err, "vyr: Secret: level 'Secret' needs the level database: No such file or directory\n");

	std::ofstream(conf_) << "# nothing\n"; // no back-end configured at all
	EXPECT_EQ(vyr({"lev", "get", "Secret"}).err, "vyr: level database: Function not implemented\n");
	std::ofstream(conf_) << "lev_backend files\n"; // named by the configuration reader
	const Result broken = vyr({"lev", "list"});
	EXPECT_EQ(broken.status, 1);
	EXPECT_NE(broken.err.find(conf_ + ":1"), std::string::npos) << broken.err;
}

// Writing a database needs a writable directory; reading it does not.
TEST_F(ToolTest, DatabaseWritesNeedAWritableDirectory)
{
	if (const char *why = no_other_user())
		GTEST_SKIP() << why;
	const Result add = vyr({"lev", "add", "Restricted", "5"}, "", true);
	EXPECT_EQ(add.status, 1);
	EXPECT_EQ(add.err, "vyr: level 'Restricted': Permission denied\n");
	const Result list = vyr({"lev", "list"}, "", true);
	EXPECT_EQ(list.status, 0) << list.err;
	EXPECT_EQ(list.out, "Unclassified\t0\nConfidential\t1\nSecret\t2\nTopSecret\t3\n");
}

// A session directory is made, labelled (CCNRA for one with links, while
// its name keeps the caller's type) and linked back to its parent.
TEST_F(ToolTest, SessionDirIsMadeLabelledAndLinked)
{
	const std::string base = path("sessions"), dir = base + "/s/l2i0c0x1t0x0";
	ASSERT_EQ(mkdir(base.c_str(), 0755), 0);
	const Result r = vyr({"session-dir", "--link", "home", "--mode", "0750", "--owner", "65534:65534", base, "s",
	                      "Secret:Low:finance"});
	ASSERT_EQ(r.status, 0) << r.err;
	EXPECT_EQ(r.out, dir + "\n");
	struct stat st;
	ASSERT_EQ(stat(dir.c_str(), &st), 0);
	EXPECT_EQ(st.st_mode & (S_IFMT | 07777), S_IFDIR | 0750u);
	EXPECT_EQ(st.st_gid, geteuid() == 0 ? 65534u : getegid());
	char target[PATH_MAX] = {};
	ASSERT_GT(readlink((dir + "/home").c_str(), target, sizeof target - 1), 0);
	EXPECT_EQ(std::string(target), base + "/s");
	EXPECT_EQ(label_of(dir), "Secret:Low:finance:CCNRA!No:No");

	// Without links and with an empty SUB, as JSON.
	EXPECT_EQ(vyr_json({"session-dir", "--json", base, "", "Confidential"})["path"], base + "//l1i0c0x0t0x0");
	EXPECT_EQ(label_of(base + "/l1i0c0x0t0x0"), "Confidential:Low:0x0:0x0!No:No");
	// Without its base.
	const Result gone = vyr({"session-dir", path("missing"), "s", "Secret"});
	EXPECT_EQ(gone.status, 1);
	EXPECT_EQ(gone.err, "vyr: " + path("missing") + "/s: No such file or directory\n");
}

} // namespace
} // namespace vyr_tool_test
