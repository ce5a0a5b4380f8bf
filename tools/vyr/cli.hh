// Shared pieces of the `vyr` command-line tool: exit codes, error messages,
// option parsing, owning handles for what the library returns, and the
// reading of label arguments.
//
// The tool uses the public interface of libvyr.so.2 and libc only.
#pragma once

#include <vyr.h>

#include <cstdint>
#include <cstdlib>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace vyr::tool {

// Exit status of every command.  `check` also uses kFailure for "denied".
enum Exit : int {
	kOk = 0,
	kFailure = 1,
	kUsage = 2,
};

// ---- messages --------------------------------------------------------------

// "vyr: SUBJECT: REASON" on stderr.
void report(std::string_view subject, std::string_view reason);
// "vyr: SUBJECT: <strerror(err)>" on stderr.
void report_errno(std::string_view subject, int err);
// A usage error: the message, then a hint to --help, on stderr.  Returns kUsage.
int usage_error(std::string_view command, std::string_view message);

// ---- owning handles --------------------------------------------------------

struct LabelPut {
	void operator()(vyrl_t *l) const noexcept { vyrl_put(l); }
};
using LabelPtr = std::unique_ptr<vyrl_t, LabelPut>;

struct CFree {
	void operator()(void *p) const noexcept { std::free(p); }
};
template <class T>
using CPtr = std::unique_ptr<T, CFree>;

// A malloc'd C string as std::string; an empty optional for NULL.
std::optional<std::string> take_string(char *s);

// ---- options ---------------------------------------------------------------

struct OptionDef {
	char short_name;        // 0 when the option has no short form
	std::string_view name;  // long name, also the key in Args
	bool takes_value;
};

// What a command line holds once its options are taken out.  --json and
// --help are known to every command and need no OptionDef.
struct Args {
	std::vector<std::string> positional;
	std::vector<std::pair<std::string, std::string>> options; // name, value
	bool json = false;
	bool help = false;

	bool has(std::string_view name) const;
	// The last value given for the option, if any.
	std::optional<std::string> value(std::string_view name) const;
};

// Parses argv[first..argc).  Options and operands may be mixed; "--" ends the
// options.  With stop_at_operand the first operand ends the options too (for
// commands that pass the rest of the line on).  On a bad option the message
// is stored in *error and nullopt returned.
std::optional<Args> parse_args(int argc, char **argv, int first,
                               const std::vector<OptionDef> &defs,
                               bool stop_at_operand, std::string *error);

// ---- numbers ---------------------------------------------------------------

// Whole-text unsigned numbers; nullopt for anything else (sign, blanks,
// trailing characters, overflow past max).
std::optional<uint64_t> parse_decimal(std::string_view text, uint64_t max);
std::optional<uint64_t> parse_hex(std::string_view text); // optional "0x"
std::optional<uint64_t> parse_octal(std::string_view text, uint64_t max);

// ---- labels ------------------------------------------------------------------

// Reads a label argument: label text (level names or numbers, as in
// "Secret:Low:finance:0x0!1,2:"), "@PATH" for the label of a path, or
// "@pid:N" for the label of a process.  On failure the reason has been
// reported and *exit_code says whether it was a usage error (text that
// does not read) or a failure (the path or process could not be read).
LabelPtr read_label_arg(const std::string &arg, int *exit_code);

// Why an argument could not be used: a usage error (text that does not
// read) or a failure (a database that can't be reached, memory).
struct Refusal {
	int exit = kOk;
	std::string reason;
};

// A level given by name (from the level database) or as a decimal number
// 0 to 255.
std::optional<uint8_t> resolve_level(const std::string &text, Refusal *why);
// A category mask given as in label text: names and hexadecimal masks.
std::optional<uint64_t> resolve_categories(const std::string &text, Refusal *why);

// Label text with names from the databases; when a level has no name or the
// level database can't be opened, the numeric text instead.  With numeric
// set, numbers only.  Empty optional only when memory runs out.
std::optional<std::string> label_text(const vyrl_t *l, bool numeric);

// Text of single fields, numbers where names are missing.
std::string level_text(uint8_t lev, bool numeric);
std::string ilevel_text(uint8_t ilev, bool numeric);
std::string category_text(uint64_t cat, bool numeric);
std::string type_text(uint16_t type, bool numeric);
std::string roles_text(const vyrrl_t *rl);

} // namespace vyr::tool
