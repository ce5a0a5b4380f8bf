// The subcommands of `vyr`.  Each takes the words from its own name on
// (argv[0] is the command's name) and returns an exit status (cli.hh).
#pragma once

#include "cli.hh"

#include <string_view>

namespace vyr::tool {

int cmd_get(int argc, char **argv);
int cmd_set(int argc, char **argv);
int cmd_id(int argc, char **argv);
int cmd_run(int argc, char **argv);
int cmd_check(int argc, char **argv);
int cmd_raw(int argc, char **argv);
int cmd_lev(int argc, char **argv);
int cmd_cat(int argc, char **argv);
int cmd_user(int argc, char **argv);
int cmd_session_dir(int argc, char **argv);

// The whole tool: argv as main gets it; returns the exit status.  Every
// exception ends here as a failure.
int tool_main(int argc, char **argv) noexcept;

// Prints the help text of a command (or of the tool for an empty name) to
// stdout.  Returns kOk.
int print_help(std::string_view command);

// Parses a command's options; on a bad option or for --help it has already
// printed what is due and returns false with *exit_code set.
bool parse_command(int argc, char **argv, const std::vector<OptionDef> &defs,
                   bool stop_at_operand, Args *args, int *exit_code);

} // namespace vyr::tool
