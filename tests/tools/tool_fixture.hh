// A private world for each test of the installed `vyr`: a scratch directory
// with a database configuration, `files` databases (levels, categories,
// users), a state directory for process labels, and a tree to label.
// Labels are kept in the `user` attribute namespace, so nothing here needs
// privileges.  Each run of vyr is a child process with its own standard
// input, output and error.
#pragma once

#include "support/scratch_dir.hh"

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <fstream>
#include <string>
#include <vector>

namespace vyr_tool_test {

struct Result {
	int status = -1; // exit status, or 128 + signal number
	std::string out;
	std::string err;
};

class ToolTest : public ::testing::Test {
protected:
	void SetUp() override;

	// Runs the installed vyr in the private environment, with `env`
	// (NAME=VALUE) set after it; with as_nobody as uid and gid 65534.
	Result vyr(const std::vector<std::string> &args, const std::string &input = {}, bool as_nobody = false,
	           const std::vector<std::string> &env = {}) const;
	// Runs vyr and parses its stdout as JSON (a failed parse fails the test).
	nlohmann::json vyr_json(const std::vector<std::string> &args, int expect_status = 0) const;
	// The label text that `vyr get` prints for a path.
	std::string label_of(const std::string &path, bool numeric = false) const;

	std::string path(const std::string &rel) const { return dir_ / rel; }
	// A file under tree/ that holds its name.
	std::string file(const std::string &name) const
	{
		std::ofstream(path("tree/" + name)) << name;
		return path("tree/" + name);
	}

	static std::string installed_vyr();
	// Why vyr can't be run as another user here, or nullptr when it can.
	// A test that needs it skips with the reason.
	static const char *no_other_user();

	vyr_test::ScratchDir dir_;
	const std::string conf_ = path("dbroute.conf");
};

} // namespace vyr_tool_test
