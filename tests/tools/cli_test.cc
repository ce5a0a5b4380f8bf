// The command line itself: version, help, usage errors and label texts that
// do not read.
#include "tool_fixture.hh"

namespace vyr_tool_test {
namespace {

using Args = std::vector<std::string>;

TEST_F(ToolTest, VersionAndHelp)
{
	EXPECT_EQ(vyr({"--version"}).out, "vyr 2.0.0 (libvyr.so.2)\n");
	for (const char *cmd : {"get", "set", "id", "run", "check", "raw", "lev", "cat", "user", "session-dir"}) {
		SCOPED_TRACE(cmd);
		const Result r = vyr({cmd, "--help"});
		EXPECT_EQ(r.status, 0) << r.err;
		EXPECT_EQ(r.out.rfind(std::string("Usage: vyr ") + cmd, 0), 0u) << r.out;
		EXPECT_NE(r.out.find("--json"), std::string::npos);
		EXPECT_TRUE(r.err.empty()) << r.err;
		EXPECT_EQ(vyr({cmd, "-h"}).out, r.out);
		EXPECT_EQ(vyr({"help", cmd}).out, r.out);
	}
	EXPECT_NE(vyr({"--help"}).out.find("vyr session-dir"), std::string::npos);
}

// Each usage error names itself on stderr, points at --help, prints nothing
// on stdout and exits 2.
TEST_F(ToolTest, UsageErrorsExitTwoWithAMessage)
{
	const std::vector<std::pair<Args, std::string>> cases = {
	    {{}, "no command given"},
	    {{"bogus"}, "unknown command 'bogus'"},
	    {{"--bogus"}, "unknown option '--bogus'"},
	    {{"get"}, "missing PATH"},
	    {{"get", "-x", "x"}, "unknown option '-x'"},
	    {{"get", "--json=1", "x"}, "takes no value"},
	    {{"set", "Secret"}, "missing PATH"},
	    {{"id", "1", "2"}, "too many arguments"},
	    {{"id", "abc"}, "not a process number"},
	    {{"run"}, "missing LABEL"},
	    {{"run", "Secret", "--"}, "missing COMMAND"},
	    {{"check", "Secret", "Secret"}, "missing ACCESS"},
	    {{"check", "Secret", "Secret", "read,"}, "unknown access word ''"},
	    {{"raw"}, "missing 'encode' or 'decode'"},
	    {{"raw", "frob"}, "unknown action 'frob'"},
	    {{"raw", "decode", "x"}, "takes no arguments"},
	    {{"lev"}, "missing action"},
	    {{"lev", "add", "x"}, "usage: lev add NAME VALUE"},
	    {{"lev", "add", "x", "256"}, "is not 0 to 255"},
	    {{"cat", "add", "x", "3"}, "exactly one bit"},
	    {{"user", "add", "u", "Secret", "0", "Nolevel", "0"}, "unknown level 'Nolevel'"},
	    {{"user", "add", "u", "Secret", "nocat", "0", "0"}, "categories 'nocat' do not read"},
	    {{"session-dir", "a"}, "missing BASE, SUB or LABEL"},
	    {{"session-dir", "--mode", "9", "a", "b", "0"}, "mode '9' is not octal"},
	    {{"session-dir", "--owner", "no-such-user:0", "a", "b", "0"}, "is not UID:GID"},
	    {{"session-dir", "--link"}, "needs a value"},
	};
	for (const auto &[args, message] : cases) {
		SCOPED_TRACE(testing::PrintToString(args));
		const Result r = vyr(args);
		EXPECT_EQ(r.status, 2) << r.err;
		EXPECT_EQ(r.err.rfind("vyr: ", 0), 0u) << r.err;
		EXPECT_NE(r.err.find(message), std::string::npos) << r.err;
		EXPECT_NE(r.err.find("--help"), std::string::npos) << r.err;
		EXPECT_TRUE(r.out.empty()) << r.out;
	}
}

// A label text that doesn't read is refused and named, by every command
// that reads labels; nothing is set.
TEST_F(ToolTest, BadLabelTextIsAnErrorNamingTheText)
{
	const std::string f = file("f");
	const std::vector<std::pair<std::string, std::string>> cases = {
	    {"Secrt:Low", "unknown level 'Secrt'"},
	    {"300", "level '300' is out of range (0 to 255)"},
	    {"", "empty label text"},
	    {"Secret:Hgh", "invalid label text"},
	    {"Secret:Low:nocat", "invalid label text"},
	};
	for (const auto &[text, message] : cases) {
		SCOPED_TRACE(text);
		for (const Args &args : {Args{"set", text, f}, Args{"check", text, "0", "read"}, Args{"raw", "encode", text}}) {
			const Result r = vyr(args);
			EXPECT_EQ(r.status, 2);
			EXPECT_EQ(r.err, "vyr: " + (text.empty() ? "''" : text) + ": " + message + "\n");
			EXPECT_TRUE(r.out.empty()) << r.out;
		}
	}
	EXPECT_EQ(label_of(f, true), "0:0:0x0:0x0!:");
}

} // namespace
} // namespace vyr_tool_test
