// A private world for each test of the installed `vyr`: a temporary
// directory with a database configuration, `files` databases (levels,
// categories, users), a state directory for process labels, and a tree to
// label.  Labels are kept in the `user` attribute namespace, so nothing here
// needs privileges.
#pragma once

#include "tool_runner.hh"

#include <gtest/gtest.h>
#include <nlohmann/json.hpp>

#include <string>
#include <vector>

namespace vyr_tool_test {

class ToolTest : public ::testing::Test {
protected:
	void SetUp() override;
	void TearDown() override;

	// Runs the installed vyr with the private environment.
	Result vyr(const std::vector<std::string> &args, const std::string &input = {},
	           bool as_nobody = false) const;
	// Runs vyr and parses its stdout as JSON (a failed parse fails the test).
	nlohmann::json vyr_json(const std::vector<std::string> &args, int expect_status = 0) const;
	// The label text that `vyr get` prints for a path.
	std::string label_of(const std::string &path, bool numeric = false) const;

	std::string path(const std::string &rel) const { return dir_ + "/" + rel; }
	std::vector<std::string> env() const;

	static std::string installed_vyr();
	static std::string prefix();

	std::string dir_;  // the private world
	std::string conf_; // its database configuration
};

} // namespace vyr_tool_test
