// check: the decision, its exit status, and the tests named on a denial.
#include "tool_fixture.hh"

#include <sys/xattr.h>
#include <unistd.h>

namespace vyr_tool_test {
namespace {

struct CheckCase {
	std::string subject;
	std::string object;
	std::vector<std::string> access;
	bool allowed;
	// "test/access" for each refusal, in the order the tool reports them
	std::vector<std::string> refused;
};

std::vector<std::string> refusals_of(const nlohmann::json &doc)
{
	std::vector<std::string> out;
	for (const auto &r : doc["refused"])
		out.push_back(r["test"].get<std::string>() +
		              (r["access"].is_null() ? "" : "/" + r["access"].get<std::string>()));
	return out;
}

TEST_F(ToolTest, CheckDecidesAndNamesWhatRefused)
{
	const std::vector<CheckCase> cases = {
	    {"Secret:Low:finance,hr", "Confidential:Low:finance", {"read"}, true, {}},
	    {"Secret:Low:finance,hr", "Confidential:Low:finance", {"read", "exec"}, true, {}},
	    {"Confidential:Low:finance", "Secret:Low:finance", {"read"}, false, {"level/read"}},
	    {"Secret:Low:finance", "Secret:Low:finance,hr", {"exec"}, false, {"category/exec"}},
	    {"Secret:Low:finance", "Confidential:Low:finance", {"write"}, false, {"level/write"}},
	    {"Confidential:Low", "Secret:Low:hr", {"read,write"}, false,
	     {"level/read", "category/read", "level/write", "category/write"}},
	    {"Secret:Low:finance", "Secret:High:finance", {"write"}, false, {"integrity/write"}},
	    {"Secret:Low:finance", "Secret:High:finance", {"write", "no-ilev"}, true, {}},
	    {"Confidential", "TopSecret", {"read", "no-lev"}, true, {}},
	    {"Confidential", "TopSecret:Low:hr", {"read", "no-lev"}, false, {"category/read"}},
	    {"Confidential", "Secret", {"write-up"}, true, {}},
	    {"Secret", "Confidential", {"write-up"}, false, {"level/write-up"}},
	    {"Confidential:Low", "Secret:High", {"write-up"}, false, {"integrity/write-up"}},
	    {"Confidential", "Secret:High:hr:ehole", {"write"}, true, {}},
	    // ccnr on the object counts only with obj-type.
	    {"Confidential:Low:finance", "Secret:High:finance,hr:ccnr", {"read"}, false,
	     {"level/read", "category/read"}},
	    {"Confidential:Low:finance", "Secret:High:finance,hr:ccnr", {"read", "obj-type"}, true, {}},
	    {"Confidential:Low:finance", "Secret:High:finance,hr:CCNRA", {"write", "obj-type"}, false,
	     {"level/write", "category/write"}},
	    {"Confidential:Low:finance", "Secret:High:finance,hr:ccnr",
	     {"read", "child", "obj-type"}, false, {"child relation"}},
	    {"Confidential:Low:finance", "Secret:High:finance,hr:CCNRA",
	     {"read", "child", "obj-type"}, true, {}},
	    {"TopSecret", "Secret:Low:0:ehole", {"child", "obj-type"}, false, {"child relation"}},
	    {"Secret", "TopSecret", {"no-lev"}, true, {}},
	};
	for (const auto &c : cases) {
		std::vector<std::string> args{"check", c.subject, c.object};
		args.insert(args.end(), c.access.begin(), c.access.end());
		SCOPED_TRACE(testing::PrintToString(args));

		const Result text = vyr(args);
		EXPECT_EQ(text.status, c.allowed ? 0 : 1) << text.err;
		EXPECT_TRUE(text.err.empty()) << text.err;
		EXPECT_EQ(text.out.substr(0, text.out.find('\n')), c.allowed ? "allowed" : "denied");
		for (const auto &r : c.refused) {
			const size_t slash = r.find('/');
			const std::string line = slash == std::string::npos
			                             ? "  " + r + ":"
			                             : "  " + r.substr(0, slash) + " refuses " + r.substr(slash + 1) + ":";
			EXPECT_NE(text.out.find(line), std::string::npos) << text.out;
		}

		args.push_back("--json");
		const nlohmann::json doc = vyr_json(args, c.allowed ? 0 : 1);
		EXPECT_EQ(doc["allowed"], c.allowed);
		EXPECT_EQ(doc["mandatory"], c.allowed);
		EXPECT_TRUE(doc["roles"].is_null());
		EXPECT_EQ(refusals_of(doc), c.refused);
	}
}

TEST_F(ToolTest, CheckReportsTheComparedValuesByName)
{
	const Result r = vyr({"check", "Confidential:Low:finance", "Secret:Low:finance,hr", "read"});
	EXPECT_EQ(r.status, 1);
	EXPECT_EQ(r.out, "denied\n"
	                 "  level refuses read: subject Confidential, object Secret\n"
	                 "  category refuses read: subject finance, object finance,hr\n");
	const nlohmann::json doc =
	    vyr_json({"check", "--json", "Secret:Low:finance", "Secret:Low:finance", "read"});
	EXPECT_EQ(doc["request"], nlohmann::json::array({"read"}));
	EXPECT_EQ(doc["request_word"], 4);
	EXPECT_EQ(doc["subject"]["text"], "Secret:Low:finance:0x0!No:No");
	EXPECT_EQ(doc["object"]["lev"], 2);
}

// Roles read from text carry no right bits, so with an access word the
// role decision grants only through labels that hold rights; those come
// from the store, written here as the raw form the stand-in service keeps.
TEST_F(ToolTest, CheckWithRolesNeedsBothDecisions)
{
	const Result raw = vyr({"raw", "encode", "Secret!5"});
	ASSERT_EQ(raw.status, 0) << raw.err;
	ASSERT_EQ(raw.out.size(), 26u + 13u);
	std::string with_read = raw.out;
	with_read[26 + 12] = 4; // rights of role 5: read
	const std::string obj = path("tree/obj");
	write_file(obj, "o");
	ASSERT_EQ(setxattr(obj.c_str(), "user.vyrlabel", with_read.data(), with_read.size(), 0), 0);
	ASSERT_EQ(vyr({"get", "-n", obj}).out, obj + "\t2:0:0x0:0x0!5:\n");

	struct RoleCase {
		std::string subject, object, access;
		bool with_roles, allowed;
		std::vector<std::string> refused;
	};
	const std::string at_obj = "@" + obj;
	const std::vector<RoleCase> cases = {
	    {"Secret!5,3", "Secret!7", "read", false, true, {}},
	    {"Secret!5,3", "Secret!7", "read", true, false, {"roles"}},
	    {"Secret!5,3", "Secret!5", "read", true, false, {"roles"}}, // no right bits
	    {"Secret!5,3", "Secret!5", "no-lev", true, true, {}},       // no right asked
	    {"Secret!:4", "Secret!:4", "no-lev", true, true, {}},
	    {"Secret!4", "Secret!:4", "no-lev", true, false, {"roles"}}, // lists never cross
	    {"Secret!9,5", at_obj, "read", true, true, {}},
	    {"Secret!9,5", at_obj, "read,write", true, false, {"roles"}},
	    {"Secret!6", at_obj, "read", true, false, {"roles"}},
	    {"Confidential!5", at_obj, "read", true, false, {"level/read"}},
	    {"Confidential!6", at_obj, "read", true, false, {"level/read", "roles"}},
	};
	for (const auto &c : cases) {
		std::vector<std::string> args{"check", "--json", c.subject, c.object, c.access};
		if (c.with_roles)
			args.push_back("--roles");
		SCOPED_TRACE(testing::PrintToString(args));
		const nlohmann::json doc = vyr_json(args, c.allowed ? 0 : 1);
		EXPECT_EQ(doc["allowed"], c.allowed);
		EXPECT_EQ(refusals_of(doc), c.refused);
		EXPECT_EQ(doc["roles"].is_boolean(), c.with_roles);
	}
}

TEST_F(ToolTest, CheckTakesLabelsOfPathsAndProcesses)
{
	const std::string f = path("tree/f");
	write_file(f, "f");
	ASSERT_EQ(vyr({"set", "Secret:Low:finance", f}).status, 0);
	EXPECT_EQ(vyr({"check", "TopSecret:Low:finance", "@" + f, "read"}).status, 0);
	// This test process has no label: the zero label may not read a Secret file.
	const std::string self = "@pid:" + std::to_string(getpid());
	const Result r = vyr({"check", self, "@" + f, "read"});
	EXPECT_EQ(r.status, 1);
	EXPECT_NE(r.out.find("level refuses read: subject Unclassified, object Secret"),
	          std::string::npos)
	    << r.out;

	const Result missing = vyr({"check", "Secret", "@" + path("missing"), "read"});
	EXPECT_EQ(missing.status, 1);
	EXPECT_EQ(missing.err, "vyr: " + path("missing") + ": No such file or directory\n");
	EXPECT_TRUE(missing.out.empty());
	const Result gone = vyr({"check", "@pid:2147483647", "Secret", "read"});
	EXPECT_EQ(gone.status, 1);
	EXPECT_EQ(gone.err, "vyr: pid 2147483647: No such process\n");
	EXPECT_EQ(vyr({"check", "@pid:x", "Secret", "read"}).status, 2);
}

} // namespace
} // namespace vyr_tool_test
