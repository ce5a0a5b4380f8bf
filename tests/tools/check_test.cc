// check: the decision, its exit status, and the tests named on a denial.
#include "tool_fixture.hh"

#include <sys/xattr.h>
#include <unistd.h>

namespace vyr_tool_test {
namespace {

// "test/access" for each refusal, in the order the tool reports them.
std::vector<std::string> refusals_of(const nlohmann::json &doc)
{
	std::vector<std::string> out;
	for (const auto &r : doc["refused"])
		out.push_back(r["test"].get<std::string>() + (r["access"].is_null() ? "" : "/" + r["access"].get<std::string>()));
	return out;
}

// Every access word, each refusing test, their order, and how the
// object's ccnr and CCNRA count under obj-type; as text and as JSON.
TEST_F(ToolTest, CheckDecidesAndNamesWhatRefused)
{
	const struct {
		std::string subject, object, access;
		std::vector<std::string> refused; // empty: allowed
	} cases[] = {
	    {"Secret:Low:finance,hr", "Confidential:Low:finance", "read,exec", {}},
	    {"Secret:Low:finance", "Secret:Low:finance,hr", "exec", {"category/exec"}},
	    {"Secret:Low:finance", "Confidential:Low:finance", "write", {"level/write"}},
	    {"Confidential:Low", "Secret:Low:hr", "read,write",
	     {"level/read", "category/read", "level/write", "category/write"}},
	    {"Secret:Low:finance", "Secret:High:finance", "write", {"integrity/write"}},
	    {"Secret:Low:finance", "Secret:High:finance", "write,no-ilev", {}},
	    {"Confidential", "TopSecret:Low:hr", "read,no-lev", {"category/read"}},
	    {"Confidential", "TopSecret:Low:hr", "read,no-lev,no-cat", {}},
	    {"Confidential", "Secret", "write-up", {}},
	    {"Confidential:Low", "Secret:High", "write-up", {"integrity/write-up"}},
	    {"Confidential:Low:finance", "Secret:High:finance,hr:ccnr", "read", {"level/read", "category/read"}},
	    {"Confidential:Low:finance", "Secret:High:finance,hr:ccnr", "read,obj-type", {}},
	    {"Confidential:Low:finance", "Secret:High:finance,hr:CCNRA", "read,write,obj-type",
	     {"level/write", "category/write"}}, // ccnr drops read, ccnri the integrity test
	    {"Confidential:Low:finance", "Secret:High:finance,hr:ccnr", "read,child,obj-type", {"child relation"}},
	    {"Confidential:Low:finance", "Secret:High:finance,hr:CCNRA", "read,child,obj-type", {}},
	};
	for (const auto &c : cases) {
		std::vector<std::string> args{"check", c.subject, c.object, c.access};
		SCOPED_TRACE(testing::PrintToString(args));
		const bool allowed = c.refused.empty();
		const Result text = vyr(args);
		EXPECT_EQ(text.status, allowed ? 0 : 1) << text.err;
		EXPECT_TRUE(text.err.empty()) << text.err;
		EXPECT_EQ(text.out.substr(0, text.out.find('\n')), allowed ? "allowed" : "denied");
		for (const auto &r : c.refused) {
			const size_t slash = r.find('/');
			const std::string line = slash == std::string::npos
			                             ? "  " + r + ":"
			                             : "  " + r.substr(0, slash) + " refuses " + r.substr(slash + 1) + ":";
			EXPECT_NE(text.out.find(line), std::string::npos) << text.out;
		}
		args.push_back("--json");
		const nlohmann::json doc = vyr_json(args, allowed ? 0 : 1);
		EXPECT_EQ(doc["allowed"], allowed);
		EXPECT_EQ(doc["mandatory"], allowed);
		EXPECT_TRUE(doc["roles"].is_null());
		EXPECT_EQ(refusals_of(doc), c.refused);
	}
}

TEST_F(ToolTest, CheckReportsTheComparedValuesByName)
{
	const Result r = vyr({"check", "Confidential:Low:finance", "Secret:Low:finance,hr", "read"});
	EXPECT_EQ(r.out, "denied\n"
	                 "  level refuses read: subject Confidential, object Secret\n"
	                 "  category refuses read: subject finance, object finance,hr\n");
	const nlohmann::json doc = vyr_json({"check", "--json", "Secret:Low:finance", "Secret:Low:finance", "read"});
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
	std::string with_read = vyr({"raw", "encode", "Secret!5"}).out;
	ASSERT_EQ(with_read.size(), 26u + 13u);
	with_read[26 + 12] = 4; // rights of role 5: read
	const std::string obj = file("obj"), at_obj = "@" + obj;
	ASSERT_EQ(setxattr(obj.c_str(), "user.vyrlabel", with_read.data(), with_read.size(), 0), 0);

	const struct {
		std::string subject, object, access;
		bool with_roles;
		std::vector<std::string> refused;
	} cases[] = {
	    {"Secret!5,3", "Secret!7", "read", false, {}},
	    {"Secret!5,3", "Secret!7", "read", true, {"roles"}},
	    {"Secret!9,5", at_obj, "read", true, {}},
	    {"Secret!9,5", at_obj, "read,write", true, {"roles"}},
	    {"Confidential!6", at_obj, "read", true, {"level/read", "roles"}},
	};
	for (const auto &c : cases) {
		std::vector<std::string> args{"check", "--json", c.subject, c.object, c.access};
		if (c.with_roles)
			args.push_back("--roles");
		SCOPED_TRACE(testing::PrintToString(args));
		const nlohmann::json doc = vyr_json(args, c.refused.empty() ? 0 : 1);
		EXPECT_EQ(doc["allowed"], c.refused.empty());
		EXPECT_EQ(refusals_of(doc), c.refused);
		EXPECT_EQ(doc["roles"].is_boolean(), c.with_roles);
	}
}

TEST_F(ToolTest, CheckTakesLabelsOfPathsAndProcesses)
{
	const std::string f = file("f");
	ASSERT_EQ(vyr({"set", "Secret:Low:finance", f}).status, 0);
	EXPECT_EQ(vyr({"check", "TopSecret:Low:finance", "@" + f, "read"}).status, 0);
	// This test process has no label: the zero label may not read a Secret file.
	const Result r = vyr({"check", "@pid:" + std::to_string(getpid()), "@" + f, "read"});
	EXPECT_EQ(r.status, 1);
	EXPECT_NE(r.out.find("level refuses read: subject Unclassified, object Secret"), std::string::npos) << r.out;

	const Result missing = vyr({"check", "Secret", "@" + path("missing"), "read"});
	EXPECT_EQ(missing.status, 1);
	EXPECT_EQ(missing.err, "vyr: " + path("missing") + ": No such file or directory\n");
	EXPECT_EQ(vyr({"check", "@pid:2147483647", "Secret", "read"}).err, "vyr: pid 2147483647: No such process\n");
	EXPECT_EQ(vyr({"check", "@pid:x", "Secret", "read"}).status, 2);
}

} // namespace
} // namespace vyr_tool_test
