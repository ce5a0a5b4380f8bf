// get, set, id, run on a real tree: names and numbers, recursion, links,
// JSON output, and the errors of missing and forbidden paths.
#include "tool_fixture.hh"

#include <sys/stat.h>
#include <unistd.h>

namespace vyr_tool_test {
namespace {

TEST_F(ToolTest, SetReadsNamesOrNumbersAndGetShowsBoth)
{
	const std::string f = path("tree/f");
	write_file(f, "data");
	const std::vector<std::tuple<std::string, std::string, std::string>> cases = {
	    // label given, text with names, numeric text
	    {"Secret:High:finance,hr", "Secret:High:finance,hr:0x0!No:No", "2:1:0x3:0x0!:"},
	    {"1:0:0x4", "Confidential:Low:ops:0x0!No:No", "1:0:0x4:0x0!:"},
	    {"TopSecret:Low:0x9:ccnr!9,3:2", "TopSecret:Low:finance,0x8:ccnr!9,3:2",
	     "3:0:0x9:0x1!9,3:2"},
	    {"7", "7:Low:0x0:0x0!No:No", "7:0:0x0:0x0!:"}, // a level without a name
	    {"!", "Unclassified:Low:0x0:0x0!No:No", "0:0:0x0:0x0!:"},
	};
	for (const auto &[given, named, numeric] : cases) {
		SCOPED_TRACE(given);
		const Result r = vyr({"set", given, f});
		ASSERT_EQ(r.status, 0) << r.err;
		EXPECT_TRUE(r.out.empty());
		EXPECT_EQ(label_of(f), named);
		EXPECT_EQ(label_of(f, true), numeric);
	}
}

TEST_F(ToolTest, SetCopiesTheLabelOfAPath)
{
	write_file(path("tree/a"), "a");
	write_file(path("tree/b"), "b");
	ASSERT_EQ(vyr({"set", "Secret:Low:hr", path("tree/a")}).status, 0);
	const Result r = vyr({"set", "@" + path("tree/a"), path("tree/b")});
	ASSERT_EQ(r.status, 0) << r.err;
	EXPECT_EQ(label_of(path("tree/b")), "Secret:Low:hr:0x0!No:No");
}

// The tree: tree/{d/{x, y}, f, l -> f}
class TreeTest : public ToolTest {
protected:
	void SetUp() override
	{
		ToolTest::SetUp();
		if (IsSkipped() || HasFatalFailure())
			return;
		ASSERT_EQ(mkdir(path("tree/d").c_str(), 0755), 0);
		write_file(path("tree/d/y"), "y");
		write_file(path("tree/d/x"), "x");
		write_file(path("tree/f"), "f");
		ASSERT_EQ(symlink("f", path("tree/l").c_str()), 0);
	}
};

TEST_F(TreeTest, RecursiveSetAndGetWalkTheTreeInNameOrder)
{
	ASSERT_EQ(vyr({"set", "-R", "Confidential:Low:finance", path("tree")}).status, 0);
	ASSERT_EQ(vyr({"set", "Secret", path("tree/d/y")}).status, 0);
	const Result r = vyr({"get", "-R", "-n", path("tree")});
	ASSERT_EQ(r.status, 0) << r.err;
	const std::string c = "\t1:0:0x1:0x0!:\n";
	EXPECT_EQ(r.out, path("tree") + c + path("tree/d") + c + path("tree/d/x") + c +
	                     path("tree/d/y") + "\t2:0:0x0:0x0!:\n" + path("tree/f") + c +
	                     path("tree/l") + c);

	const nlohmann::json j = vyr_json({"get", "--recursive", "--json", path("tree/d")});
	ASSERT_TRUE(j.is_array());
	ASSERT_EQ(j.size(), 3u);
	EXPECT_EQ(j[0]["path"], path("tree/d"));
	EXPECT_EQ(j[2]["path"], path("tree/d/y"));
	EXPECT_EQ(j[2]["label"]["lev_name"], "Secret");
	EXPECT_EQ(j[1]["label"]["cat_text"], "finance");
}

// Under the user namespace a link itself can't carry a label: -d reads the
// zero label and setting it is refused, while without -d the target counts.
TEST_F(TreeTest, NoDereferenceActsOnTheLinkItself)
{
	ASSERT_EQ(vyr({"set", "Secret", path("tree/l")}).status, 0);
	EXPECT_EQ(label_of(path("tree/f")), "Secret:Low:0x0:0x0!No:No");
	const Result link = vyr({"get", "-d", path("tree/l")});
	EXPECT_EQ(link.status, 0) << link.err;
	EXPECT_EQ(link.out, path("tree/l") + "\tUnclassified:Low:0x0:0x0!No:No\n");
	const Result set = vyr({"set", "-d", "TopSecret", path("tree/l")});
	EXPECT_EQ(set.status, 1);
	EXPECT_EQ(set.err, "vyr: " + path("tree/l") + ": Operation not permitted\n");
	EXPECT_EQ(label_of(path("tree/f")), "Secret:Low:0x0:0x0!No:No");
}

TEST_F(TreeTest, MissingPathIsReportedAndTheOthersStillShown)
{
	const std::string missing = path("tree/missing");
	const Result r = vyr({"get", "-n", path("tree/f"), missing, path("tree/d")});
	EXPECT_EQ(r.status, 1);
	EXPECT_EQ(r.err, "vyr: " + missing + ": No such file or directory\n");
	EXPECT_EQ(r.out, path("tree/f") + "\t0:0:0x0:0x0!:\n" + path("tree/d") + "\t0:0:0x0:0x0!:\n");

	const Result set = vyr({"set", "Secret", missing, path("tree/f")});
	EXPECT_EQ(set.status, 1);
	EXPECT_EQ(set.err, "vyr: " + missing + ": No such file or directory\n");
	EXPECT_EQ(label_of(path("tree/f")), "Secret:Low:0x0:0x0!No:No");

	// A dangling link: following it fails, the link itself reads.
	ASSERT_EQ(symlink("nowhere", path("tree/dangling").c_str()), 0);
	EXPECT_EQ(vyr({"get", path("tree/dangling")}).status, 1);
	EXPECT_EQ(vyr({"get", "-d", path("tree/dangling")}).status, 0);
}

TEST_F(TreeTest, OtherUsersMeetPermissionDenied)
{
	if (geteuid() != 0)
		GTEST_SKIP() << "needs root to run the tool as another user (uid 65534)";
	ASSERT_EQ(vyr({"set", "Secret", path("tree/f")}).status, 0);
	ASSERT_EQ(chmod(path("tree/f").c_str(), 0), 0);
	const Result get = vyr({"get", path("tree/f")}, "", true);
	EXPECT_EQ(get.status, 1);
	EXPECT_EQ(get.err, "vyr: " + path("tree/f") + ": Permission denied\n");
	EXPECT_TRUE(get.out.empty());

	// In the user namespace a label is written with write permission on the
	// file, which the other user lacks here.
	ASSERT_EQ(chmod(path("tree/f").c_str(), 0644), 0);
	const Result set = vyr({"set", "TopSecret", path("tree/f")}, "", true);
	EXPECT_EQ(set.status, 1);
	EXPECT_EQ(set.err, "vyr: " + path("tree/f") + ": Permission denied\n");
	EXPECT_EQ(label_of(path("tree/f")), "Secret:Low:0x0:0x0!No:No");

	// An unreadable directory stops the walk below it, not the walk.
	ASSERT_EQ(chmod(path("tree/d").c_str(), 0700), 0);
	const Result walk = vyr({"get", "-R", path("tree")}, "", true);
	EXPECT_EQ(walk.status, 1);
	EXPECT_NE(walk.err.find("vyr: " + path("tree/d") + ": Permission denied"), std::string::npos)
	    << walk.err;
	EXPECT_NE(walk.out.find(path("tree/l") + "\t"), std::string::npos) << walk.out;
}

TEST_F(ToolTest, JsonLabelCarriesEveryField)
{
	const std::string f = path("tree/f");
	write_file(f, "f");
	ASSERT_EQ(vyr({"set", "Secret:High:finance,0x10:ccnr,ehole!9,3:2", f}).status, 0);
	const nlohmann::json j = vyr_json({"get", "--json", f});
	ASSERT_EQ(j.size(), 1u);
	const auto &l = j[0]["label"];
	EXPECT_EQ(l["text"], "Secret:High:finance,0x10:ccnr,ehole!9,3:2");
	EXPECT_EQ(l["numeric"], "2:1:0x11:0x5!9,3:2");
	EXPECT_EQ(l["lev"], 2);
	EXPECT_EQ(l["lev_name"], "Secret");
	EXPECT_EQ(l["ilev"], 1);
	EXPECT_EQ(l["cat"], "0x11");
	EXPECT_EQ(l["cat_text"], "finance,0x10");
	EXPECT_EQ(l["type"], 5);
	EXPECT_EQ(l["type_text"], "ccnr,ehole");
	EXPECT_EQ(l["blob_size"], 0);
	EXPECT_EQ(l["roles1"], nlohmann::json::array({9, 3}));
	EXPECT_EQ(l["roles2"], nlohmann::json::array({2}));

	// A level without a name has a null name.
	ASSERT_EQ(vyr({"set", "9", f}).status, 0);
	EXPECT_TRUE(vyr_json({"--json", "get", f})[0]["label"]["lev_name"].is_null());
}

// Paths are bytes: control characters, quotes and bytes that are not UTF-8
// must still give valid JSON.
TEST_F(ToolTest, JsonEscapesAnyPath)
{
	const std::string name = path("tree/q\"\\\n\t\x01\xff\xc3\xa9");
	write_file(name, "x");
	const nlohmann::json j = vyr_json({"get", "--json", name});
	ASSERT_EQ(j.size(), 1u);
	EXPECT_EQ(j[0]["path"], path("tree/q\"\\\n\t\x01\xc3\xbf\xc3\xa9"));
}

TEST_F(ToolTest, IdShowsTheLabelThatRunSet)
{
	const Result plain = vyr({"id"});
	EXPECT_EQ(plain.status, 0) << plain.err;
	EXPECT_EQ(plain.out, "Unclassified:Low:0x0:0x0!No:No\n");

	const std::string tool = installed_vyr();
	const Result r = vyr({"run", "Confidential:Low:hr", "--", tool, "id"});
	EXPECT_EQ(r.status, 0) << r.err;
	EXPECT_EQ(r.out, "Confidential:Low:hr:0x0!No:No\n");

	// Without "--" too, and the command's own options are its own.
	const Result n = vyr({"run", "Secret", tool, "id", "-n"});
	EXPECT_EQ(n.status, 0) << n.err;
	EXPECT_EQ(n.out, "2:0:0x0:0x0!:\n");

	// The command's exit status comes back.
	EXPECT_EQ(vyr({"run", "Secret", "--", "/bin/sh", "-c", "exit 7"}).status, 7);

	const Result j = vyr({"run", "TopSecret", "--", tool, "id", "--json"});
	ASSERT_EQ(j.status, 0) << j.err;
	const auto doc = nlohmann::json::parse(j.out);
	EXPECT_GT(doc["pid"].get<int>(), 0);
	EXPECT_EQ(doc["label"]["lev_name"], "TopSecret");
}

TEST_F(ToolTest, IdAndRunFailures)
{
	const Result gone = vyr({"id", "2147483647"});
	EXPECT_EQ(gone.status, 1);
	EXPECT_EQ(gone.err, "vyr: pid 2147483647: No such process\n");

	const Result missing = vyr({"run", "Secret", "--", path("no-such-program")});
	EXPECT_EQ(missing.status, 127);
	EXPECT_EQ(missing.err, "vyr: " + path("no-such-program") + ": No such file or directory\n");

	write_file(path("not-executable"), "#!/bin/sh\n");
	const Result noexec = vyr({"run", "Secret", "--", path("not-executable")});
	EXPECT_EQ(noexec.status, 126);
	EXPECT_EQ(noexec.err, "vyr: " + path("not-executable") + ": Permission denied\n");

	// Without a place to keep process labels, nothing is run.
	RunOptions opt;
	opt.env = env();
	opt.env.push_back("VYR_TAVREL_STATE_DIR=relative/dir");
	const Result r = run_program(installed_vyr(), {"run", "Secret", "--", "/bin/true"}, opt);
	EXPECT_EQ(r.status, 1);
	EXPECT_EQ(r.err.rfind("vyr: pid ", 0), 0u) << r.err;
	EXPECT_NE(r.err.find("Invalid argument"), std::string::npos) << r.err;
}

} // namespace
} // namespace vyr_tool_test
