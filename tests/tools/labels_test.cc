// get, set, id, run on a real tree: names and numbers, recursion, links,
// JSON output, and the errors of missing and forbidden paths.
#include "tool_fixture.hh"

#include <sys/stat.h>
#include <unistd.h>

namespace vyr_tool_test {
namespace {

TEST_F(ToolTest, SetReadsNamesNumbersOrAPathAndGetShowsBoth)
{
	const std::string f = file("f"), g = file("g");
	const std::vector<std::tuple<std::string, std::string, std::string>> cases = {
	    // label given, text with names, numeric text
	    {"Secret:High:finance,hr", "Secret:High:finance,hr:0x0!No:No", "2:1:0x3:0x0!:"},
	    {"TopSecret:Low:0x9:ccnr!9,3:2", "TopSecret:Low:finance,0x8:ccnr!9,3:2", "3:0:0x9:0x1!9,3:2"},
	    {"7", "7:Low:0x0:0x0!No:No", "7:0:0x0:0x0!:"}, // a level without a name
	    {"@" + g, "Unclassified:Low:0x0:0x0!No:No", "0:0:0x0:0x0!:"}, // the label of a path
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

// The tree: tree/{d/{x, y}, f, l -> f}
class TreeTest : public ToolTest {
protected:
	void SetUp() override
	{
		ToolTest::SetUp();
		if (IsSkipped() || HasFatalFailure())
			return;
		ASSERT_EQ(mkdir(path("tree/d").c_str(), 0755), 0);
		file("d/y"), file("d/x"), file("f");
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
	EXPECT_EQ(r.out, path("tree") + c + path("tree/d") + c + path("tree/d/x") + c + path("tree/d/y") +
	                     "\t2:0:0x0:0x0!:\n" + path("tree/f") + c + path("tree/l") + c);

	const nlohmann::json j = vyr_json({"get", "--recursive", "--json", path("tree/d")});
	ASSERT_EQ(j.size(), 3u);
	EXPECT_EQ(j[0]["path"], path("tree/d"));
	EXPECT_EQ(j[2]["path"], path("tree/d/y"));
	EXPECT_EQ(j[2]["label"]["lev_name"], "Secret");
}

// Under the user namespace a link itself can't carry a label: -d reads the
// zero label and setting it is refused, while without -d the target counts.
TEST_F(TreeTest, NoDereferenceActsOnTheLinkItself)
{
	ASSERT_EQ(vyr({"set", "Secret", path("tree/l")}).status, 0);
	EXPECT_EQ(label_of(path("tree/f")), "Secret:Low:0x0:0x0!No:No");
	EXPECT_EQ(vyr({"get", "-d", path("tree/l")}).out, path("tree/l") + "\tUnclassified:Low:0x0:0x0!No:No\n");
	const Result set = vyr({"set", "-d", "TopSecret", path("tree/l")});
	EXPECT_EQ(set.status, 1);
	EXPECT_EQ(set.err, "vyr: " + path("tree/l") + ": Operation not permitted\n");
	EXPECT_EQ(label_of(path("tree/f")), "Secret:Low:0x0:0x0!No:No");
}

// A path that fails is reported with status 1, and the others are still done.
TEST_F(TreeTest, MissingPathIsReportedAndTheOthersStillDone)
{
	const std::string missing = path("tree/missing");
	const Result r = vyr({"get", "-n", path("tree/f"), missing, path("tree/d")});
	EXPECT_EQ(r.status, 1);
	EXPECT_EQ(r.err, "vyr: " + missing + ": No such file or directory\n");
	EXPECT_EQ(r.out, path("tree/f") + "\t0:0:0x0:0x0!:\n" + path("tree/d") + "\t0:0:0x0:0x0!:\n");
	EXPECT_EQ(vyr({"set", "Secret", missing, path("tree/f")}).status, 1);
	EXPECT_EQ(label_of(path("tree/f")), "Secret:Low:0x0:0x0!No:No");
	// A dangling link: following it fails, the link itself reads.
	ASSERT_EQ(symlink("nowhere", path("tree/dangling").c_str()), 0);
	EXPECT_EQ(vyr({"get", path("tree/dangling")}).status, 1);
	EXPECT_EQ(vyr({"get", "-d", path("tree/dangling")}).status, 0);
}

TEST_F(TreeTest, OtherUsersMeetPermissionDenied)
{
	if (const char *why = no_other_user())
		GTEST_SKIP() << why;
	const std::string f = path("tree/f");
	ASSERT_EQ(vyr({"set", "Secret", f}).status, 0);
	ASSERT_EQ(chmod(f.c_str(), 0), 0);
	const Result get = vyr({"get", f}, "", true);
	EXPECT_EQ(get.status, 1);
	EXPECT_EQ(get.err, "vyr: " + f + ": Permission denied\n");
	// A label is written with write permission on the file, which the other
	// user lacks here.
	ASSERT_EQ(chmod(f.c_str(), 0644), 0);
	EXPECT_EQ(vyr({"set", "TopSecret", f}, "", true).err, "vyr: " + f + ": Permission denied\n");
	EXPECT_EQ(label_of(f), "Secret:Low:0x0:0x0!No:No");
	// An unreadable directory stops the walk below it, not the walk.
	ASSERT_EQ(chmod(path("tree/d").c_str(), 0700), 0);
	const Result walk = vyr({"get", "-R", path("tree")}, "", true);
	EXPECT_EQ(walk.status, 1);
	EXPECT_NE(walk.err.find("vyr: " + path("tree/d") + ": Permission denied"), std::string::npos) << walk.err;
	EXPECT_NE(walk.out.find(path("tree/l") + "\t"), std::string::npos) << walk.out;
}

TEST_F(ToolTest, JsonLabelCarriesEveryField)
{
	const std::string f = file("f");
	ASSERT_EQ(vyr({"set", "Secret:High:finance,0x10:ccnr,ehole!9,3:2", f}).status, 0);
	const nlohmann::json j = vyr_json({"get", "--json", f});
	ASSERT_EQ(j.size(), 1u);
	EXPECT_EQ(j[0]["label"], nlohmann::json::parse(R"({
	    "text": "Secret:High:finance,0x10:ccnr,ehole!9,3:2", "numeric": "2:1:0x11:0x5!9,3:2",
	    "lev": 2, "lev_name": "Secret", "ilev": 1, "cat": "0x11", "cat_text": "finance,0x10",
	    "type": 5, "type_text": "ccnr,ehole", "blob_size": 0, "roles1": [9, 3], "roles2": [2]})"));
	// A level without a name has a null name.
	ASSERT_EQ(vyr({"set", "9", f}).status, 0);
	EXPECT_TRUE(vyr_json({"--json", "get", f})[0]["label"]["lev_name"].is_null());
}

// Paths are bytes: control characters, quotes and bytes that are not UTF-8
// must still give valid JSON.
TEST_F(ToolTest, JsonEscapesAnyPath)
{
	const std::string name = file("q\"\\\n\t\x01\xff\xc3\xa9");
	const nlohmann::json j = vyr_json({"get", "--json", name});
	ASSERT_EQ(j.size(), 1u);
	EXPECT_EQ(j[0]["path"], path("tree/q\"\\\n\t\x01\xc3\xbf\xc3\xa9"));
}

TEST_F(ToolTest, IdShowsTheLabelThatRunSet)
{
	EXPECT_EQ(vyr({"id"}).out, "Unclassified:Low:0x0:0x0!No:No\n");
	const std::string tool = installed_vyr();
	EXPECT_EQ(vyr({"run", "Confidential:Low:hr", "--", tool, "id"}).out, "Confidential:Low:hr:0x0!No:No\n");
	// Without "--" too, and the command's own options are its own.
	EXPECT_EQ(vyr({"run", "Secret", tool, "id", "-n"}).out, "2:0:0x0:0x0!:\n");
	// The command's exit status comes back.
	EXPECT_EQ(vyr({"run", "Secret", "--", "/bin/sh", "-c", "exit 7"}).status, 7);
	const auto doc = nlohmann::json::parse(vyr({"run", "TopSecret", "--", tool, "id", "--json"}).out);
	EXPECT_GT(doc["pid"].get<int>(), 0);
	EXPECT_EQ(doc["label"]["lev_name"], "TopSecret");
}

TEST_F(ToolTest, IdAndRunFailures)
{
	const std::string missing = path("no-such-program"), noexec = file("not-executable");
	const struct {
		std::vector<std::string> args;
		std::vector<std::string> env;
		int status;
		std::string err;
	} cases[] = {
	    {{"id", "2147483647"}, {}, 1, "vyr: pid 2147483647: No such process\n"},
	    {{"run", "Secret", "--", missing}, {}, 127, "vyr: " + missing + ": No such file or directory\n"},
	    {{"run", "Secret", "--", noexec}, {}, 126, "vyr: " + noexec + ": Permission denied\n"},
	    // Without a place to keep process labels, nothing is run.
	    {{"run", "Secret", "--", "/bin/echo", "ran"}, {"VYR_TAVREL_STATE_DIR=relative/dir"}, 1,
	     "vyr: pid " /* number */},
	};
	for (const auto &c : cases) {
		SCOPED_TRACE(testing::PrintToString(c.args));
		const Result r = vyr(c.args, "", false, c.env);
		EXPECT_EQ(r.status, c.status);
		EXPECT_EQ(r.err.substr(0, c.err.size()), c.err);
		EXPECT_TRUE(r.out.empty()) << r.out;
	}
}

} // namespace
} // namespace vyr_tool_test
