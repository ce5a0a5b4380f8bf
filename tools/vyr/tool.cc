// The command table, help texts and the dispatch of `vyr`.
#include "commands.hh"

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <new>
#include <string>

#ifndef VYR_TOOL_VERSION
#define VYR_TOOL_VERSION "unknown"
#endif

namespace vyr::tool {

namespace {

struct Command {
	std::string_view name;
	int (*run)(int, char **);
	std::string_view synopsis;
	std::string_view description;
};

constexpr Command kCommands[] = {
    {"get", cmd_get, "get [-n] [-d] [-R] [--json] PATH...",
     "Print the label of each PATH as PATH<TAB>LABEL, with level and category\n"
     "names from the databases.\n"
     "  -n, --numeric          numbers instead of names\n"
     "  -d, --no-dereference   the label of a symbolic link itself\n"
     "  -R, --recursive        also everything below each directory (symbolic\n"
     "                         links are listed, never followed into)\n"},
    {"set", cmd_set, "set [-d] [-R] LABEL PATH...",
     "Set the label of each PATH.  LABEL is label text with names or numbers\n"
     "(\"Secret:Low:finance\"), or @PATH / @pid:N to copy the label of a path\n"
     "or a process.\n"
     "  -d, --no-dereference   label a symbolic link itself\n"
     "  -R, --recursive        also everything below each directory\n"},
    {"id", cmd_id, "id [-n] [--json] [PID]",
     "Print the label of process PID, or of the calling process.\n"
     "  -n, --numeric          numbers instead of names\n"},
    {"run", cmd_run, "run LABEL -- COMMAND [ARG...]",
     "Set the label of this process to LABEL, then run COMMAND in its place.\n"
     "Exit status 126 when COMMAND can't be run, 127 when it is not found.\n"},
    {"check", cmd_check, "check [--roles] [--json] SUBJECT OBJECT ACCESS...",
     "Decide whether SUBJECT may access OBJECT.  Both are label text, @PATH or\n"
     "@pid:N.  ACCESS words (several, or joined by commas, all must pass):\n"
     "  read write exec write-up child obj-type no-lev no-cat no-ilev\n"
     "Prints \"allowed\", or \"denied\" and each test that refused (level,\n"
     "category, integrity, child relation, roles).\n"
     "Exit status 0 allowed, 1 denied (or failure), 2 usage error.\n"
     "  --roles                the role lists must grant the access too\n"},
    {"raw", cmd_raw, "raw encode [--hex] LABEL | raw decode [-n] [--hex] [--json]",
     "Convert between label text and the portable whole-label byte form.\n"
     "encode writes the bytes of LABEL to stdout; decode reads bytes from stdin\n"
     "and prints the label.\n"
     "  --hex                  hexadecimal text instead of bytes\n"
     "  -n, --numeric          numbers instead of names (decode)\n"},
    {"lev", cmd_lev, "lev list | get NAME|VALUE | add NAME VALUE | rm NAME|VALUE",
     "Manage the level database.  VALUE is a decimal number, 0 to 255.\n"
     "  -n, --numeric          (list, get) print numbers only where names are asked for\n"},
    {"cat", cmd_cat, "cat list | get NAME|VALUE | add NAME VALUE | rm NAME|VALUE",
     "Manage the category database.  VALUE is a hexadecimal mask (\"0x\"\n"
     "optional), as in label text; a category added is exactly one bit.\n"},
    {"user", cmd_user,
     "user list | get NAME|UID | add NAME LEV1 CAT1 LEV2 CAT2 | rm NAME",
     "Manage the user label database.  Levels and categories are given by\n"
     "name or number, categories as in label text (\"finance,hr\" or 0x3).\n"
     "  -n, --numeric          numbers instead of names\n"},
    {"session-dir", cmd_session_dir,
     "session-dir [--link NAME] [--owner UID:GID] [--mode MODE] BASE SUB LABEL",
     "Make (or repair) the session directory of LABEL under BASE/SUB and print\n"
     "its path.  SUB may be empty.\n"
     "  --link NAME            add links NAME and \"vyr\" back to BASE/SUB\n"
     "  --owner UID:GID        owner of the directory (names or numbers;\n"
     "                         default: the caller)\n"
     "  --mode MODE            octal permission bits (default 0700)\n"},
};

const Command *find_command(std::string_view name)
{
	for (const auto &c : kCommands)
		if (c.name == name)
			return &c;
	return nullptr;
}

constexpr std::string_view kCommonOptions =
    "  --json                 machine-readable output\n"
    "  -h, --help             this help\n";

int print_tool_help()
{
	std::printf("Usage: vyr [--json] COMMAND [OPTIONS] [ARGS]\n"
	            "       vyr --version | --help | COMMAND --help\n\n"
	            "Show, set and decide on security labels.\n\nCommands:\n");
	for (const auto &c : kCommands)
		std::printf("  vyr %.*s\n", static_cast<int>(c.synopsis.size()), c.synopsis.data());
	std::printf("\nExit status: 0 success, 1 failure, 2 usage error.\n"
	            "See vyr(1) for label text, configuration and examples.\n");
	return kOk;
}

} // namespace

int print_help(std::string_view command)
{
	const Command *c = find_command(command);
	if (c == nullptr)
		return print_tool_help();
	std::printf("Usage: vyr %.*s\n\n%.*s%.*s", static_cast<int>(c->synopsis.size()),
	            c->synopsis.data(), static_cast<int>(c->description.size()),
	            c->description.data(), static_cast<int>(kCommonOptions.size()),
	            kCommonOptions.data());
	return kOk;
}

bool parse_command(int argc, char **argv, const std::vector<OptionDef> &defs,
                   bool stop_at_operand, Args *args, int *exit_code)
{
	std::string error;
	auto parsed = parse_args(argc, argv, 1, defs, stop_at_operand, &error);
	if (!parsed) {
		*exit_code = usage_error(argv[0], error);
		return false;
	}
	*args = std::move(*parsed);
	if (args->help) {
		*exit_code = print_help(argv[0]);
		return false;
	}
	return true;
}

namespace {

int dispatch(int argc, char **argv)
{
	// Options before the command: --json is handed on to the command.
	int i = 1;
	bool json = false;
	for (; i < argc && argv[i][0] == '-'; ++i) {
		const std::string_view a = argv[i];
		if (a == "--version") {
			std::printf("vyr %s (libvyr.so.2)\n", VYR_TOOL_VERSION);
			return kOk;
		}
		if (a == "--help" || a == "-h")
			return print_tool_help();
		if (a == "--json") {
			json = true;
			continue;
		}
		return usage_error("vyr", "unknown option '" + std::string(a) + "'");
	}
	if (i >= argc)
		return usage_error("vyr", "no command given");
	const Command *c = find_command(argv[i]);
	if (c == nullptr) {
		if (std::string_view(argv[i]) == "help")
			return print_help(i + 1 < argc ? argv[i + 1] : "");
		return usage_error("vyr", "unknown command '" + std::string(argv[i]) + "'");
	}
	// The command sees its own name as argv[0]; a leading --json goes behind
	// it, where every command's parser knows it.
	std::vector<char *> sub(argv + i, argv + argc);
	static char json_word[] = "--json";
	if (json)
		sub.insert(sub.begin() + 1, json_word);
	sub.push_back(nullptr);
	return c->run(static_cast<int>(sub.size() - 1), sub.data());
}

} // namespace

int tool_main(int argc, char **argv) noexcept
{
	try {
		const int status = dispatch(argc, argv);
		if (std::fflush(stdout) != 0 || std::ferror(stdout)) {
			std::fprintf(stderr, "vyr: standard output: %s\n", std::strerror(errno));
			return kFailure;
		}
		return status;
	} catch (const std::bad_alloc &) {
		std::fprintf(stderr, "vyr: %s\n", std::strerror(ENOMEM));
	} catch (const std::exception &e) {
		std::fprintf(stderr, "vyr: %s\n", e.what());
	}
	return kFailure;
}

} // namespace vyr::tool
