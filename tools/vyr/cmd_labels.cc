// get, set, id, run: the labels of paths and processes.
#include "commands.hh"
#include "json.hh"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include <dirent.h>
#include <sys/stat.h>
#include <unistd.h>

namespace vyr::tool {

namespace {

const std::vector<OptionDef> kPathOptions = {
    {'n', "numeric", false},
    {'d', "no-dereference", false},
    {'R', "recursive", false},
};

// Calls visit on each path and, when recursive, on everything below each
// directory, in name order.  Symbolic links met below the top are never
// followed; a top-level link to a directory is followed unless `no_deref`.
// Returns false if any visit or directory read failed (already reported).
class TreeWalk {
public:
	TreeWalk(bool recursive, bool no_deref, std::function<bool(const std::string &)> visit)
	    : recursive_(recursive), no_deref_(no_deref), visit_(std::move(visit))
	{
	}

	bool run(const std::vector<std::string> &paths)
	{
		bool ok = true;
		for (const auto &p : paths)
			ok = walk(p, true) && ok;
		return ok;
	}

private:
	bool walk(const std::string &path, bool top)
	{
		bool ok = visit_(path);
		if (recursive_ && is_directory(path, top && !no_deref_))
			ok = walk_children(path) && ok;
		return ok;
	}

	static bool is_directory(const std::string &path, bool follow)
	{
		struct stat st;
		const int rc = follow ? stat(path.c_str(), &st) : lstat(path.c_str(), &st);
		return rc == 0 && S_ISDIR(st.st_mode);
	}

	bool walk_children(const std::string &dir)
	{
		// Closed on every way out, an exception from the name list included.
		const std::unique_ptr<DIR, int (*)(DIR *)> d(opendir(dir.c_str()), closedir);
		if (!d) {
			report_errno(dir, errno);
			return false;
		}
		std::vector<std::string> names;
		errno = 0;
		while (const dirent *e = readdir(d.get())) {
			const std::string_view n = e->d_name;
			if (n != "." && n != "..")
				names.emplace_back(n);
			errno = 0;
		}
		const int read_errno = errno;
		if (read_errno != 0) {
			report_errno(dir, read_errno);
			return false;
		}
		std::sort(names.begin(), names.end());
		const std::string prefix = dir.back() == '/' ? dir : dir + "/";
		bool ok = true;
		for (const auto &n : names)
			ok = walk(prefix + n, false) && ok;
		return ok;
	}

	bool recursive_;
	bool no_deref_;
	std::function<bool(const std::string &)> visit_;
};

int need_operands(const Args &args, size_t n, const char *command, const char *what)
{
	if (args.positional.size() >= n)
		return kOk;
	return usage_error(command, std::string("missing ") + what);
}

} // namespace

int cmd_get(int argc, char **argv)
{
	Args args;
	int status;
	if (!parse_command(argc, argv, kPathOptions, false, &args, &status))
		return status;
	if (int rc = need_operands(args, 1, "get", "PATH"))
		return rc;
	const bool numeric = args.has("numeric");
	const bool no_deref = args.has("no-dereference");

	JsonWriter json;
	json.begin_array();
	auto visit = [&](const std::string &path) {
		LabelPtr l(no_deref ? vyr_get_lpath(path.c_str()) : vyr_get_path(path.c_str()));
		if (!l) {
			report_errno(path, errno);
			return false;
		}
		if (args.json) {
			json.begin_object();
			json.key("path").string(path);
			json.key("label");
			json_label(json, l.get());
			json.end_object();
			return true;
		}
		const auto text = label_text(l.get(), numeric);
		if (!text) {
			report_errno(path, ENOMEM);
			return false;
		}
		std::printf("%s\t%s\n", path.c_str(), text->c_str());
		return true;
	};
	const bool ok = TreeWalk(args.has("recursive"), no_deref, visit).run(args.positional);
	json.end_array();
	if (args.json)
		json.print();
	return ok ? kOk : kFailure;
}

int cmd_set(int argc, char **argv)
{
	Args args;
	int status;
	if (!parse_command(argc, argv, kPathOptions, false, &args, &status))
		return status;
	if (int rc = need_operands(args, 2, "set", args.positional.empty() ? "LABEL" : "PATH"))
		return rc;
	LabelPtr label = read_label_arg(args.positional[0], &status);
	if (!label)
		return status;
	const bool no_deref = args.has("no-dereference");
	auto visit = [&](const std::string &path) {
		const int rc = no_deref ? vyr_set_lpath(path.c_str(), label.get())
		                        : vyr_set_path(path.c_str(), label.get());
		if (rc != 0) {
			report_errno(path, errno);
			return false;
		}
		return true;
	};
	const std::vector<std::string> paths(args.positional.begin() + 1, args.positional.end());
	return TreeWalk(args.has("recursive"), no_deref, visit).run(paths) ? kOk : kFailure;
}

int cmd_id(int argc, char **argv)
{
	Args args;
	int status;
	if (!parse_command(argc, argv, {{'n', "numeric", false}}, false, &args, &status))
		return status;
	if (args.positional.size() > 1)
		return usage_error("id", "too many arguments");
	int pid = static_cast<int>(getpid());
	if (!args.positional.empty()) {
		const auto n = parse_decimal(args.positional[0], INT32_MAX);
		if (!n)
			return usage_error("id", "'" + args.positional[0] + "' is not a process number");
		pid = static_cast<int>(*n);
	}
	LabelPtr l(vyr_get_pid(pid));
	if (!l) {
		report_errno("pid " + std::to_string(pid), errno);
		return kFailure;
	}
	if (args.json) {
		JsonWriter json;
		json.begin_object();
		json.key("pid").number(static_cast<uint64_t>(pid));
		json.key("label");
		json_label(json, l.get());
		json.end_object();
		json.print();
		return kOk;
	}
	const auto text = label_text(l.get(), args.has("numeric"));
	if (!text) {
		report_errno("pid " + std::to_string(pid), ENOMEM);
		return kFailure;
	}
	std::printf("%s\n", text->c_str());
	return kOk;
}

int cmd_run(int argc, char **argv)
{
	Args args;
	int status;
	if (!parse_command(argc, argv, {}, true, &args, &status))
		return status;
	auto &words = args.positional;
	if (words.empty())
		return usage_error("run", "missing LABEL");
	if (words.size() > 1 && words[1] == "--")
		words.erase(words.begin() + 1);
	if (words.size() < 2)
		return usage_error("run", "missing COMMAND");

	LabelPtr label = read_label_arg(words[0], &status);
	if (!label)
		return status;
	const int pid = static_cast<int>(getpid());
	if (vyr_set_pid(pid, label.get()) != 0) {
		report_errno("pid " + std::to_string(pid), errno);
		return kFailure;
	}
	label.reset();

	std::vector<char *> cmd;
	for (size_t i = 1; i < words.size(); ++i)
		cmd.push_back(words[i].data());
	cmd.push_back(nullptr);
	std::fflush(stdout);
	execvp(cmd[0], cmd.data());
	// As other programs that run a command in their place: 127 when it is
	// not there, 126 when it is there but can't be run.
	const int err = errno;
	report_errno(words[1], err);
	return err == ENOENT ? 127 : 126;
}

} // namespace vyr::tool
