// raw encode/decode, the three databases, and session directories.
#include "tool_fixture.hh"

#include <climits>
#include <fstream>
#include <sstream>

#include <sys/stat.h>
#include <unistd.h>

namespace vyr_tool_test {
namespace {

using Args = std::vector<std::string>;

// ---- raw ---------------------------------------------------------------------

TEST_F(ToolTest, RawEncodeWritesTheWholeLabelForm)
{
	// version 1, type 0, lev 1, ilev 0, cat 1, no blob, no roles
	const std::string hex = "0100" "0000" "01" "00" "0100000000000000" "00000000" "00000000" "00000000";
	const Result r = vyr({"raw", "encode", "--hex", "Confidential:Low:finance"});
	EXPECT_EQ(r.status, 0) << r.err;
	EXPECT_EQ(r.out, hex + "\n");
	const nlohmann::json j = vyr_json({"raw", "encode", "--json", "1:0:0x1"});
	EXPECT_EQ(j["size"], 26);
	EXPECT_EQ(j["hex"], hex);

	const Result back = vyr({"raw", "decode", "--hex"}, hex + "\n");
	EXPECT_EQ(back.status, 0) << back.err;
	EXPECT_EQ(back.out, "Confidential:Low:finance:0x0!No:No\n");
}

TEST_F(ToolTest, RawRoundTripThroughBytes)
{
	for (const std::string text : {"Secret:High:finance,hr:ccnr!9,3:2", "0", "TopSecret:Low:0x0:ALL!:7"}) {
		SCOPED_TRACE(text);
		const Result bytes = vyr({"raw", "encode", text});
		ASSERT_EQ(bytes.status, 0) << bytes.err;
		const Result named = vyr({"raw", "decode"}, bytes.out);
		const Result numeric = vyr({"raw", "decode", "-n"}, bytes.out);
		ASSERT_EQ(named.status, 0) << named.err;
		const Result direct = vyr({"raw", "encode", "--hex", named.out.substr(0, named.out.size() - 1)});
		const Result again = vyr({"raw", "encode", "--hex", text});
		EXPECT_EQ(direct.out, again.out); // the printed text reads back to the same bytes
		const nlohmann::json j = nlohmann::json::parse(vyr({"raw", "decode", "--json"}, bytes.out).out);
		EXPECT_EQ(j["text"].get<std::string>() + "\n", named.out);
		EXPECT_EQ(j["numeric"].get<std::string>() + "\n", numeric.out);
	}
}

TEST_F(ToolTest, RawDecodeRefusesWhatIsNotOneWholeForm)
{
	const Result ok = vyr({"raw", "encode", "Secret!9"});
	ASSERT_EQ(ok.status, 0);
	const std::vector<std::pair<std::string, std::string>> cases = {
	    {"", "not a whole-label raw form (0 bytes)"},
	    {ok.out.substr(0, 10), "not a whole-label raw form (10 bytes)"},
	    {ok.out.substr(0, ok.out.size() - 1), "not a whole-label raw form (38 bytes)"},
	    {ok.out + "x", "not a whole-label raw form (40 bytes)"},
	    {std::string("\x02\x00", 2) + ok.out.substr(2), "not a whole-label raw form"},
	};
	for (const auto &[input, message] : cases) {
		SCOPED_TRACE(input.size());
		const Result r = vyr({"raw", "decode"}, input);
		EXPECT_EQ(r.status, 1);
		EXPECT_EQ(r.err.rfind("vyr: standard input: " + message, 0), 0u) << r.err;
		EXPECT_TRUE(r.out.empty());
	}
	const Result bad_hex = vyr({"raw", "decode", "--hex"}, "01zz");
	EXPECT_EQ(bad_hex.status, 1);
	EXPECT_EQ(bad_hex.err, "vyr: standard input: not hexadecimal text\n");
	EXPECT_EQ(vyr({"raw", "decode", "--hex"}, "010").status, 1);
}

// ---- databases -----------------------------------------------------------------

TEST_F(ToolTest, LevelDatabaseListGetAddRemove)
{
	EXPECT_EQ(vyr({"lev", "list"}).out, "Unclassified\t0\nConfidential\t1\nSecret\t2\nTopSecret\t3\n");
	const nlohmann::json all = vyr_json({"lev", "list", "--json"});
	ASSERT_EQ(all.size(), 4u);
	EXPECT_EQ(all[3], (nlohmann::json{{"name", "TopSecret"}, {"value", 3}}));

	EXPECT_EQ(vyr({"lev", "get", "Secret"}).out, "Secret\t2\n");
	EXPECT_EQ(vyr({"lev", "get", "2"}).out, "Secret\t2\n");
	EXPECT_EQ(vyr_json({"lev", "get", "--json", "1"})["name"], "Confidential");

	ASSERT_EQ(vyr({"lev", "add", "Restricted", "5"}).status, 0);
	EXPECT_EQ(vyr({"lev", "get", "5"}).out, "Restricted\t5\n");
	// A level name is now known to label text too.
	write_file(path("tree/f"), "f");
	ASSERT_EQ(vyr({"set", "Restricted", path("tree/f")}).status, 0);
	EXPECT_EQ(label_of(path("tree/f"), true), "5:0:0x0:0x0!:");

	ASSERT_EQ(vyr({"lev", "rm", "5"}).status, 0); // by value
	ASSERT_EQ(vyr({"lev", "rm", "TopSecret"}).status, 0);
	EXPECT_EQ(vyr({"lev", "list"}).out, "Unclassified\t0\nConfidential\t1\nSecret\t2\n");

	for (const Args &args : {Args{"lev", "get", "Nope"}, Args{"lev", "get", "9"},
	                         Args{"lev", "rm", "Nope"}, Args{"lev", "rm", "9"}}) {
		SCOPED_TRACE(testing::PrintToString(args));
		const Result r = vyr(args);
		EXPECT_EQ(r.status, 1);
		EXPECT_EQ(r.err, "vyr: level '" + args[2] + "': no such entry\n");
	}
	// The back-end refuses names that would not read back.
	const Result bad = vyr({"lev", "add", "has:colon", "7"});
	EXPECT_EQ(bad.status, 1);
	EXPECT_EQ(bad.err, "vyr: level 'has:colon': Invalid argument\n");
}

TEST_F(ToolTest, CategoryDatabaseListGetAddRemove)
{
	EXPECT_EQ(vyr({"cat", "list"}).out, "finance\t0x1\nhr\t0x2\nops\t0x4\n");
	ASSERT_EQ(vyr({"cat", "add", "legal", "0x8"}).status, 0);
	ASSERT_EQ(vyr({"cat", "add", "top", "8000000000000000"}).status, 0);
	EXPECT_EQ(vyr({"cat", "get", "8"}).out, "legal\t0x8\n");
	EXPECT_EQ(vyr_json({"cat", "get", "--json", "top"})["value"], "0x8000000000000000");
	write_file(path("tree/f"), "f");
	ASSERT_EQ(vyr({"set", "1:0:legal,top,hr", path("tree/f")}).status, 0);
	EXPECT_EQ(label_of(path("tree/f")), "Confidential:Low:hr,legal,top:0x0!No:No");
	ASSERT_EQ(vyr({"cat", "rm", "legal"}).status, 0);
	ASSERT_EQ(vyr({"cat", "rm", "0x8000000000000000"}).status, 0);
	EXPECT_EQ(vyr_json({"cat", "list", "--json"}).size(), 3u);
	const Result r = vyr({"cat", "get", "legal"});
	EXPECT_EQ(r.status, 1);
	EXPECT_EQ(r.err, "vyr: category 'legal': no such entry\n");
}

TEST_F(ToolTest, UserDatabaseListGetAddRemove)
{
	EXPECT_EQ(vyr({"user", "list"}).out,
	          "alice\tSecret:finance,hr\tUnclassified:0x0\nbob\tConfidential:finance\tUnclassified:0x0\n");
	EXPECT_EQ(vyr({"user", "get", "-n", "bob"}).out, "bob\t1:0x1\t0:0x0\n");

	ASSERT_EQ(vyr({"user", "add", "carol", "TopSecret", "finance,ops", "1", "0x2"}).status, 0);
	const nlohmann::json carol = vyr_json({"user", "get", "--json", "carol"});
	EXPECT_EQ(carol["lev1"], 3);
	EXPECT_EQ(carol["lev1_text"], "TopSecret");
	EXPECT_EQ(carol["cat1"], "0x5");
	EXPECT_EQ(carol["cat1_text"], "finance,ops");
	EXPECT_EQ(carol["lev2"], 1);
	EXPECT_EQ(carol["cat2_text"], "hr");

	// Replacing keeps one entry.
	ASSERT_EQ(vyr({"user", "add", "carol", "0", "0", "0", "0"}).status, 0);
	const nlohmann::json all = vyr_json({"user", "list", "--json"});
	ASSERT_EQ(all.size(), 3u);
	EXPECT_EQ(all[2]["name"], "carol");
	EXPECT_EQ(all[2]["lev1"], 0);

	ASSERT_EQ(vyr({"user", "rm", "carol"}).status, 0);
	const Result gone = vyr({"user", "get", "carol"});
	EXPECT_EQ(gone.status, 1);
	EXPECT_EQ(gone.err, "vyr: user 'carol': no such entry\n");
	EXPECT_EQ(vyr({"user", "rm", "carol"}).status, 1);
}

TEST_F(ToolTest, DatabaseFailuresAreReported)
{
	// A configuration whose directory does not exist: the databases can't
	// open, and labels are shown in numbers alone.
	write_file(conf_, "lev_backend = files\ncat_backend = files\nmac_backend = files\n"
	                  "files_dir = " + path("no-such-dir") + "\n");
	for (const char *db : {"lev", "cat", "user"}) {
		SCOPED_TRACE(db);
		const Result r = vyr({db, "list"});
		EXPECT_EQ(r.status, 1);
		EXPECT_NE(r.err.find(" database: No such file or directory"), std::string::npos) << r.err;
	}
	write_file(path("tree/f"), "f");
	ASSERT_EQ(vyr({"set", "2:1:0x3", path("tree/f")}).status, 0);
	EXPECT_EQ(label_of(path("tree/f")), "2:1:0x3:0x0!:");
	const Result named = vyr({"set", "Secret", path("tree/f")});
	EXPECT_EQ(named.status, 2);
	EXPECT_EQ(named.err, "vyr: Secret: level 'Secret' needs the level database: "
	                     "No such file or directory\n");

	// No back-end configured at all.
	write_file(conf_, "# nothing\n");
	const Result none = vyr({"lev", "get", "Secret"});
	EXPECT_EQ(none.status, 1);
	EXPECT_EQ(none.err, "vyr: level database: Function not implemented\n");

	// A broken configuration file is named by the configuration reader.
	write_file(conf_, "lev_backend files\n");
	const Result broken = vyr({"lev", "list"});
	EXPECT_EQ(broken.status, 1);
	EXPECT_NE(broken.err.find(conf_ + ":1"), std::string::npos) << broken.err;
}

TEST_F(ToolTest, DatabaseWritesNeedAWritableDirectory)
{
	if (geteuid() != 0)
		GTEST_SKIP() << "needs root to run the tool as another user (uid 65534)";
	const Result r = vyr({"lev", "add", "Restricted", "5"}, "", true);
	EXPECT_EQ(r.status, 1);
	EXPECT_EQ(r.err, "vyr: level 'Restricted': Permission denied\n");
	EXPECT_EQ(vyr({"lev", "list"}, "", true).status, 0); // reading is fine
}

// ---- session directories ---------------------------------------------------------

TEST_F(ToolTest, SessionDirIsMadeLabelledAndLinked)
{
	const std::string base = path("sessions");
	ASSERT_EQ(mkdir(base.c_str(), 0755), 0);
	const Result r = vyr({"session-dir", "--link", "home", "--mode", "0750", "--owner",
	                      "65534:65534", base, "s", "Secret:Low:finance"});
	ASSERT_EQ(r.status, 0) << r.err;
	const std::string dir = base + "/s/l2i0c0x1t0x0";
	EXPECT_EQ(r.out, dir + "\n");
	struct stat st;
	ASSERT_EQ(stat(dir.c_str(), &st), 0);
	EXPECT_TRUE(S_ISDIR(st.st_mode));
	EXPECT_EQ(st.st_mode & 07777, 0750u);
	if (geteuid() == 0) {
		EXPECT_EQ(st.st_uid, 65534u);
		EXPECT_EQ(st.st_gid, 65534u);
	}
	char target[PATH_MAX] = {};
	ASSERT_GT(readlink((dir + "/home").c_str(), target, sizeof target - 1), 0);
	EXPECT_EQ(std::string(target), base + "/s");
	ASSERT_GT(readlink((dir + "/vyr").c_str(), target, sizeof target - 1), 0);
	// The links make the directory's label CCNRA; its name keeps the caller's type.
	EXPECT_EQ(label_of(dir), "Secret:Low:finance:CCNRA!No:No");

	// Again, without links and with an empty SUB, as JSON.
	const nlohmann::json j = vyr_json({"session-dir", "--json", base, "", "Confidential"});
	EXPECT_EQ(j["path"], base + "//l1i0c0x0t0x0");
	EXPECT_EQ(label_of(base + "/l1i0c0x0t0x0"), "Confidential:Low:0x0:0x0!No:No");
}

TEST_F(ToolTest, SessionDirFailsWithoutItsBase)
{
	const std::string base = path("missing");
	const Result r = vyr({"session-dir", base, "s", "Secret"});
	EXPECT_EQ(r.status, 1);
	EXPECT_EQ(r.err, "vyr: " + base + "/s: No such file or directory\n");
	EXPECT_TRUE(r.out.empty());
}

} // namespace
} // namespace vyr_tool_test
