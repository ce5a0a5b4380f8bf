// check: decide an access between two labels and tell which test refused.
//
// The answer is the library's own: vyrl_permission for the mandatory rules,
// and with --roles vyrrl_permission as well.  On a denial the tool asks the
// layers below the mandatory decision one by one (child relation, then the
// level, category and integrity tests for each access word) to name what
// refused.
#include "commands.hh"
#include "json.hh"

#include <algorithm>
#include <cstdio>
#include <optional>
#include <string>
#include <vector>

namespace vyr::tool {

namespace {

struct AccessWord {
	std::string_view word;
	int bit;
};

constexpr AccessWord kAccessWords[] = {
    {"read", VYR_REQ_READ},         {"write", VYR_REQ_WRITE},
    {"exec", VYR_REQ_EXEC},         {"write-up", VYR_REQ_WRITE_UP},
    {"child", VYR_REQ_CHILD},       {"obj-type", VYR_REQ_OBJ_TYPE},
    {"no-lev", VYR_REQ_NO_LEV},     {"no-cat", VYR_REQ_NO_CAT},
    {"no-ilev", VYR_REQ_NO_ILEV},
};

// The request bits that switch a field test off.
constexpr int kSwitchBits = VYR_REQ_NO_LEV | VYR_REQ_NO_CAT | VYR_REQ_NO_ILEV;

std::string_view word_of(int bit)
{
	for (const auto &w : kAccessWords)
		if (w.bit == bit)
			return w.word;
	return "?";
}

// ACCESS arguments, each one word or several joined by commas.
bool parse_request(const std::vector<std::string> &words, int *request, std::string *bad)
{
	*request = 0;
	for (const auto &arg : words) {
		size_t start = 0;
		while (start <= arg.size()) {
			const size_t comma = std::min(arg.find(',', start), arg.size());
			const std::string_view w = std::string_view(arg).substr(start, comma - start);
			bool known = false;
			for (const auto &a : kAccessWords)
				if (a.word == w) {
					*request |= a.bit;
					known = true;
				}
			if (!known) {
				*bad = std::string(w);
				return false;
			}
			start = comma + 1;
		}
	}
	return true;
}

// One test that refused: its name, the access word it refused (empty for
// tests that are not per access), and the two values it compared.
struct Finding {
	std::string test;
	std::string access;
	std::string subject;
	std::string object;
};

// The request as the mandatory decision applies it to the field tests: with
// obj-type, an object's ccnr drops the read and exec demands and its ccnri
// drops the integrity test.
int effective_request(const vyrml_t *object, int request)
{
	if (!(request & VYR_REQ_OBJ_TYPE))
		return request;
	if (vyrml_type(object) & VYR_TYPE_CCNR)
		request &= ~(VYR_REQ_READ | VYR_REQ_EXEC);
	if (vyrml_type(object) & VYR_TYPE_CCNRI)
		request |= VYR_REQ_NO_ILEV;
	return request;
}

// The mandatory part with names, or in numbers when that fails.
std::string mandatory_text(const vyrml_t *ml)
{
	if (auto named = take_string(vyrml_get_text(ml, 0)))
		return *named;
	return take_string(vyrml_get_text(ml, VYR_TEXT_NUMERIC)).value_or("?");
}

// Why the mandatory decision refused, asked of the layers below it.
std::vector<Finding> mandatory_refusals(const vyrl_t *subject, const vyrl_t *object, int request)
{
	const vyrml_t *s = vyrl_ml(subject);
	const vyrml_t *o = vyrl_ml(object);
	if ((request & VYR_REQ_CHILD) && (request & VYR_REQ_OBJ_TYPE) &&
	    vyr_child_parent(subject, object) != 0)
		return {{"child relation", "", mandatory_text(s), mandatory_text(o)}};

	std::vector<Finding> out;
	const int req = effective_request(o, request);
	for (int bit : {VYR_REQ_READ, VYR_REQ_WRITE, VYR_REQ_EXEC, VYR_REQ_WRITE_UP}) {
		if (!(req & bit))
			continue;
		// Each access alone, with the switches that were asked for: the
		// tests are a conjunction over the access bits.
		const int one = bit | (req & kSwitchBits);
		const std::string access(word_of(bit));
		if (vyr_lev_permission(vyrml_lev(s), vyrml_lev(o), one) != 0)
			out.push_back({"level", access, level_text(vyrml_lev(s), false),
			               level_text(vyrml_lev(o), false)});
		if (vyr_cat_permission(vyrml_cat(s), vyrml_cat(o), one) != 0)
			out.push_back({"category", access, category_text(vyrml_cat(s), false),
			               category_text(vyrml_cat(o), false)});
		if (vyr_ilev_permission(vyrml_ilev(s), vyrml_ilev(o), one) != 0)
			out.push_back({"integrity", access, ilevel_text(vyrml_ilev(s), false),
			               ilevel_text(vyrml_ilev(o), false)});
	}
	if (out.empty()) // not expected: the field tests should explain a denial
		out.push_back({"mandatory", "", mandatory_text(s), mandatory_text(o)});
	return out;
}

void print_text(bool allowed, const std::vector<Finding> &refusals)
{
	if (allowed) {
		std::printf("allowed\n");
		return;
	}
	std::printf("denied\n");
	for (const auto &r : refusals) {
		std::printf("  %s", r.test.c_str());
		if (!r.access.empty())
			std::printf(" refuses %s", r.access.c_str());
		std::printf(": subject %s, object %s\n", r.subject.c_str(), r.object.c_str());
	}
}

void print_json(const vyrl_t *subject, const vyrl_t *object, int request, bool mandatory,
                std::optional<bool> roles, const std::vector<Finding> &refusals)
{
	JsonWriter j;
	j.begin_object();
	j.key("allowed").boolean(mandatory && roles.value_or(true));
	j.key("mandatory").boolean(mandatory);
	j.key("roles");
	if (roles)
		j.boolean(*roles);
	else
		j.null();
	j.key("request").begin_array();
	for (const auto &w : kAccessWords)
		if (request & w.bit)
			j.string(w.word);
	j.end_array();
	j.key("request_word").number(static_cast<uint64_t>(request));
	j.key("refused").begin_array();
	for (const auto &r : refusals) {
		j.begin_object();
		j.key("test").string(r.test);
		j.key("access");
		if (r.access.empty())
			j.null();
		else
			j.string(r.access);
		j.key("subject").string(r.subject);
		j.key("object").string(r.object);
		j.end_object();
	}
	j.end_array();
	j.key("subject");
	json_label(j, subject);
	j.key("object");
	json_label(j, object);
	j.end_object();
	j.print();
}

} // namespace

int cmd_check(int argc, char **argv)
{
	Args args;
	int status;
	if (!parse_command(argc, argv, {{0, "roles", false}}, false, &args, &status))
		return status;
	if (args.positional.size() < 3)
		return usage_error("check", args.positional.size() < 2 ? "missing SUBJECT or OBJECT"
		                                                       : "missing ACCESS");
	int request;
	std::string bad;
	if (!parse_request({args.positional.begin() + 2, args.positional.end()}, &request, &bad))
		return usage_error("check", "unknown access word '" + bad + "'");
	LabelPtr subject = read_label_arg(args.positional[0], &status);
	if (!subject)
		return status;
	LabelPtr object = read_label_arg(args.positional[1], &status);
	if (!object)
		return status;

	const bool mandatory = vyrl_permission(subject.get(), object.get(), request) == 0;
	std::vector<Finding> refusals;
	if (!mandatory)
		refusals = mandatory_refusals(subject.get(), object.get(), request);
	std::optional<bool> roles;
	if (args.has("roles")) {
		roles = vyrrl_permission(vyrl_rl(subject.get()), vyrl_rl(object.get()), request) == 0;
		if (!*roles)
			refusals.push_back({"roles", "", roles_text(vyrl_rl(subject.get())),
			                    roles_text(vyrl_rl(object.get()))});
	}
	const bool allowed = mandatory && roles.value_or(true);
	if (args.json)
		print_json(subject.get(), object.get(), request, mandatory, roles, refusals);
	else
		print_text(allowed, refusals);
	return allowed ? kOk : kFailure;
}

} // namespace vyr::tool
