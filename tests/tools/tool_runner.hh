// Runs the installed `vyr` (or any program) as a child process with a given
// environment and standard input, and collects its exit status and output.
#pragma once

#include <string>
#include <string_view>
#include <vector>

namespace vyr_tool_test {

struct Result {
	int status = -1; // exit status, or 128 + signal number
	std::string out;
	std::string err;
};

struct RunOptions {
	std::string input;           // written to the child's stdin, then closed
	bool as_nobody = false;      // drop to uid/gid 65534 before exec
	std::vector<std::string> env; // NAME=VALUE pairs added to (or replacing) the environment
};

// Runs program with args (args[0] is not the program name: it is added).
Result run_program(const std::string &program, const std::vector<std::string> &args,
                   const RunOptions &opt = {});

// Recursively removes a directory tree; missing paths are fine.
void remove_tree(const std::string &path);

// Writes a whole file; throws std::runtime_error on failure.
void write_file(const std::string &path, std::string_view content);

} // namespace vyr_tool_test
