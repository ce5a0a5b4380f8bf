// session-dir: make (or repair) the session directory of a label.
#include "commands.hh"
#include "json.hh"

#include <cerrno>
#include <cstdio>
#include <string>

#include <grp.h>
#include <pwd.h>
#include <unistd.h>

namespace vyr::tool {

namespace {

std::optional<uint32_t> user_id(const std::string &s)
{
	if (auto n = parse_decimal(s, UINT32_MAX))
		return static_cast<uint32_t>(*n);
	if (const passwd *pw = getpwnam(s.c_str()))
		return pw->pw_uid;
	return std::nullopt;
}

std::optional<uint32_t> group_id(const std::string &s)
{
	if (auto n = parse_decimal(s, UINT32_MAX))
		return static_cast<uint32_t>(*n);
	if (const group *gr = getgrnam(s.c_str()))
		return gr->gr_gid;
	return std::nullopt;
}

} // namespace

int cmd_session_dir(int argc, char **argv)
{
	Args args;
	int status;
	const std::vector<OptionDef> defs = {
	    {0, "link", true},
	    {0, "owner", true},
	    {0, "mode", true},
	};
	if (!parse_command(argc, argv, defs, false, &args, &status))
		return status;
	if (args.positional.size() != 3)
		return usage_error("session-dir", args.positional.size() < 3 ? "missing BASE, SUB or LABEL"
		                                                             : "too many arguments");
	uint32_t uid = getuid();
	uint32_t gid = getgid();
	if (auto owner = args.value("owner")) {
		const size_t colon = owner->find(':');
		const auto u = user_id(owner->substr(0, colon));
		const auto g = colon == std::string::npos ? std::optional<uint32_t>(gid)
		                                          : group_id(owner->substr(colon + 1));
		if (!u || !g)
			return usage_error("session-dir", "owner '" + *owner + "' is not UID:GID");
		uid = *u;
		gid = *g;
	}
	uint32_t mode = 0700;
	if (auto m = args.value("mode")) {
		const auto v = parse_octal(*m, 07777);
		if (!v)
			return usage_error("session-dir", "mode '" + *m + "' is not octal (0 to 7777)");
		mode = static_cast<uint32_t>(*v);
	}
	LabelPtr label = read_label_arg(args.positional[2], &status);
	if (!label)
		return status;

	const std::string &base = args.positional[0];
	const std::string &sub = args.positional[1];
	const auto link = args.value("link");
	errno = 0;
	auto path = take_string(vyrlugm_make_session_dir(base.c_str(), sub.c_str(),
	                                                 link ? link->c_str() : nullptr,
	                                                 label.get(), uid, gid, mode));
	if (!path) {
		report_errno(sub.empty() ? base : base + "/" + sub, errno);
		return kFailure;
	}
	if (args.json) {
		JsonWriter j;
		j.begin_object();
		j.key("path").string(*path);
		j.end_object();
		j.print();
	} else {
		std::printf("%s\n", path->c_str());
	}
	return kOk;
}

} // namespace vyr::tool
