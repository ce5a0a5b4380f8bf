#include "tool_fixture.hh"

#include <cstdlib>

#include <sys/stat.h>
#include <unistd.h>

namespace vyr_tool_test {

std::string ToolTest::prefix()
{
	const char *p = std::getenv("VYR_TOOL_PREFIX");
	return p != nullptr ? p : "";
}

std::string ToolTest::installed_vyr()
{
	return prefix() + "/bin/vyr";
}

std::vector<std::string> ToolTest::env() const
{
	return {"VYR_DBROUTE_CONF=" + conf_, "VYR_TAVREL_XATTR_NS=user",
	        "VYR_TAVREL_STATE_DIR=" + dir_ + "/state", "LC_ALL=C"};
}

void ToolTest::SetUp()
{
	if (prefix().empty() || access(installed_vyr().c_str(), X_OK) != 0)
		GTEST_SKIP() << "installed vyr not found (VYR_TOOL_PREFIX=" << prefix() << ")";
	const char *tmp = std::getenv("TMPDIR");
	std::string templ = std::string(tmp != nullptr && *tmp ? tmp : "/tmp") + "/vyr-tool-XXXXXX";
	ASSERT_NE(mkdtemp(templ.data()), nullptr);
	dir_ = templ;
	// Other users must reach the tree for the permission tests.
	ASSERT_EQ(chmod(dir_.c_str(), 0755), 0);
	ASSERT_EQ(mkdir(path("db").c_str(), 0755), 0);
	ASSERT_EQ(mkdir(path("tree").c_str(), 0755), 0);
	conf_ = path("dbroute.conf");
	write_file(conf_, "mac_backend = files\nlev_backend = files\ncat_backend = files\n"
	                  "files_dir = " + path("db") + "\n");
	write_file(path("db/levels"),
	           "Unclassified:0\nConfidential:1\nSecret:2\nTopSecret:3\n");
	write_file(path("db/categories"), "finance:1\nhr:2\nops:4\n");
	write_file(path("db/users"), "alice:2:3:0:0\nbob:1:1:0:0\n");

	// The labels live in extended attributes of the user namespace; a file
	// system without them can't run these tests.
	write_file(path("tree/probe"), "x");
	const Result probe = vyr({"set", "1", path("tree/probe")});
	if (probe.status != 0 && probe.err.find("not supported") != std::string::npos)
		GTEST_SKIP() << "no user.* extended attributes under " << dir_ << "; set TMPDIR";
	ASSERT_EQ(probe.status, 0) << probe.err;
	ASSERT_EQ(::unlink(path("tree/probe").c_str()), 0);
}

void ToolTest::TearDown()
{
	if (!dir_.empty())
		remove_tree(dir_);
}

Result ToolTest::vyr(const std::vector<std::string> &args, const std::string &input,
                     bool as_nobody) const
{
	RunOptions opt;
	opt.input = input;
	opt.as_nobody = as_nobody;
	opt.env = env();
	return run_program(installed_vyr(), args, opt);
}

nlohmann::json ToolTest::vyr_json(const std::vector<std::string> &args, int expect_status) const
{
	const Result r = vyr(args);
	EXPECT_EQ(r.status, expect_status) << r.err;
	try {
		return nlohmann::json::parse(r.out);
	} catch (const nlohmann::json::exception &e) {
		ADD_FAILURE() << "not JSON: " << e.what() << "\n" << r.out;
		return {};
	}
}

std::string ToolTest::label_of(const std::string &p, bool numeric) const
{
	std::vector<std::string> args{"get"};
	if (numeric)
		args.push_back("-n");
	args.push_back(p);
	const Result r = vyr(args);
	EXPECT_EQ(r.status, 0) << r.err;
	const std::string prefix = p + "\t";
	EXPECT_EQ(r.out.rfind(prefix, 0), 0u) << r.out;
	std::string text = r.out.substr(std::min(prefix.size(), r.out.size()));
	if (!text.empty() && text.back() == '\n')
		text.pop_back();
	return text;
}

} // namespace vyr_tool_test
