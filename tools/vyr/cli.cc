#include "cli.hh"

#include <cerrno>
#include <cstdio>
#include <cstring>

namespace vyr::tool {

// ---- messages --------------------------------------------------------------

void report(std::string_view subject, std::string_view reason)
{
	std::fprintf(stderr, "vyr: %.*s: %.*s\n", static_cast<int>(subject.size()), subject.data(),
	             static_cast<int>(reason.size()), reason.data());
}

void report_errno(std::string_view subject, int err)
{
	report(subject, std::strerror(err));
}

int usage_error(std::string_view command, std::string_view message)
{
	// Errors of the tool's own words name no command.
	if (command == "vyr") {
		std::fprintf(stderr, "vyr: %.*s\nTry 'vyr --help'.\n", static_cast<int>(message.size()),
		             message.data());
		return kUsage;
	}
	report(command, message);
	std::fprintf(stderr, "Try 'vyr %.*s --help'.\n", static_cast<int>(command.size()),
	             command.data());
	return kUsage;
}

std::optional<std::string> take_string(char *s)
{
	CPtr<char> owned(s);
	if (!owned)
		return std::nullopt;
	return std::string(owned.get());
}

// ---- options ---------------------------------------------------------------

bool Args::has(std::string_view name) const
{
	for (const auto &[n, v] : options)
		if (n == name)
			return true;
	return false;
}

std::optional<std::string> Args::value(std::string_view name) const
{
	std::optional<std::string> found;
	for (const auto &[n, v] : options)
		if (n == name)
			found = v;
	return found;
}

namespace {

const OptionDef *find_long(const std::vector<OptionDef> &defs, std::string_view name)
{
	for (const auto &s : defs)
		if (s.name == name)
			return &s;
	return nullptr;
}

const OptionDef *find_short(const std::vector<OptionDef> &defs, char c)
{
	for (const auto &s : defs)
		if (s.short_name == c)
			return &s;
	return nullptr;
}

// Takes a value for `def` from the rest of the word or the next argument.
bool take_value(const OptionDef &def, std::string_view inline_value, bool has_inline, int argc,
                char **argv, int *i, Args *args, std::string *error)
{
	if (has_inline) {
		args->options.emplace_back(def.name, inline_value);
		return true;
	}
	if (*i + 1 >= argc) {
		*error = "option '--" + std::string(def.name) + "' needs a value";
		return false;
	}
	args->options.emplace_back(def.name, argv[++*i]);
	return true;
}

bool parse_long(std::string_view word, const std::vector<OptionDef> &defs, int argc,
                char **argv, int *i, Args *args, std::string *error)
{
	std::string_view body = word.substr(2);
	const size_t eq = body.find('=');
	const std::string_view name = body.substr(0, eq);
	const bool has_inline = eq != std::string_view::npos;
	if (name == "json" || name == "help") {
		if (has_inline) {
			*error = "option '--" + std::string(name) + "' takes no value";
			return false;
		}
		(name == "json" ? args->json : args->help) = true;
		return true;
	}
	const OptionDef *def = find_long(defs, name);
	if (def == nullptr) {
		*error = "unknown option '--" + std::string(name) + "'";
		return false;
	}
	if (def->takes_value)
		return take_value(*def, has_inline ? body.substr(eq + 1) : std::string_view(),
		                  has_inline, argc, argv, i, args, error);
	if (has_inline) {
		*error = "option '--" + std::string(name) + "' takes no value";
		return false;
	}
	args->options.emplace_back(def->name, "");
	return true;
}

// A group of short options such as "-nR", or "-mVALUE".
bool parse_short(std::string_view word, const std::vector<OptionDef> &defs, int argc,
                 char **argv, int *i, Args *args, std::string *error)
{
	for (size_t k = 1; k < word.size(); ++k) {
		const char c = word[k];
		if (c == 'h') {
			args->help = true;
			continue;
		}
		const OptionDef *def = find_short(defs, c);
		if (def == nullptr) {
			*error = std::string("unknown option '-") + c + "'";
			return false;
		}
		if (def->takes_value) {
			const bool has_inline = k + 1 < word.size();
			return take_value(*def, word.substr(k + 1), has_inline, argc, argv, i, args,
			                  error);
		}
		args->options.emplace_back(def->name, "");
	}
	return true;
}

} // namespace

std::optional<Args> parse_args(int argc, char **argv, int first,
                               const std::vector<OptionDef> &defs, bool stop_at_operand,
                               std::string *error)
{
	Args args;
	bool options_done = false;
	for (int i = first; i < argc; ++i) {
		const std::string_view word = argv[i];
		if (options_done || word.size() < 2 || word[0] != '-') {
			args.positional.emplace_back(word);
			if (stop_at_operand)
				options_done = true;
			continue;
		}
		if (word == "--") {
			options_done = true;
			continue;
		}
		const bool ok = word[1] == '-' ? parse_long(word, defs, argc, argv, &i, &args, error)
		                               : parse_short(word, defs, argc, argv, &i, &args, error);
		if (!ok)
			return std::nullopt;
	}
	return args;
}

// ---- numbers ---------------------------------------------------------------

namespace {

std::optional<uint64_t> parse_base(std::string_view text, unsigned base, uint64_t max)
{
	if (text.empty())
		return std::nullopt;
	uint64_t v = 0;
	for (char c : text) {
		unsigned d;
		if (c >= '0' && c <= '9')
			d = static_cast<unsigned>(c - '0');
		else if (c >= 'a' && c <= 'f')
			d = static_cast<unsigned>(c - 'a' + 10);
		else if (c >= 'A' && c <= 'F')
			d = static_cast<unsigned>(c - 'A' + 10);
		else
			return std::nullopt;
		if (d >= base || v > (max - d) / base)
			return std::nullopt;
		v = v * base + d;
	}
	return v;
}

} // namespace

std::optional<uint64_t> parse_decimal(std::string_view text, uint64_t max)
{
	return parse_base(text, 10, max);
}

std::optional<uint64_t> parse_hex(std::string_view text)
{
	if (text.size() > 2 && text[0] == '0' && (text[1] == 'x' || text[1] == 'X'))
		text.remove_prefix(2);
	return parse_base(text, 16, UINT64_MAX);
}

std::optional<uint64_t> parse_octal(std::string_view text, uint64_t max)
{
	return parse_base(text, 8, max);
}

// ---- labels ------------------------------------------------------------------

namespace {

// A database lookup that found nothing: a miss is the caller's mistake,
// anything else (memory, an unreadable file) a failure.
void refuse_lookup(int err, const std::string &what, Refusal *why)
{
	if (err == 0 || err == ENOENT || err == ENODATA || err == EINVAL) {
		*why = {kUsage, "unknown " + what};
		return;
	}
	*why = {kFailure, what + ": " + std::strerror(err)};
}

} // namespace

std::optional<uint8_t> resolve_level(const std::string &text, Refusal *why)
{
	if (!text.empty() && text.find_first_not_of("0123456789") == std::string::npos) {
		if (auto v = parse_decimal(text, 255))
			return static_cast<uint8_t>(*v);
		*why = {kUsage, "level '" + text + "' is out of range (0 to 255)"};
		return std::nullopt;
	}
	errno = 0;
	void *db = openlevdb_r();
	if (db == nullptr) {
		*why = {kFailure, "level '" + text + "' needs the level database: " + std::strerror(errno)};
		return std::nullopt;
	}
	errno = 0;
	levent_t *ent = getlevnam_r(db, text.c_str());
	const int err = errno;
	closelevdb_r(db);
	if (ent == nullptr) {
		refuse_lookup(err, "level '" + text + "'", why);
		return std::nullopt;
	}
	const uint8_t value = ent->value;
	freelevent_r(ent);
	return value;
}

std::optional<uint64_t> resolve_categories(const std::string &text, Refusal *why)
{
	uint64_t mask = 0;
	errno = 0;
	if (vyr_cat_from_text(text.c_str(), &mask) != 0) {
		if (errno == ENOMEM)
			*why = {kFailure, "categories '" + text + "': " + std::strerror(errno)};
		else
			*why = {kUsage, "categories '" + text + "' do not read"};
		return std::nullopt;
	}
	return mask;
}

namespace {

// The library reads a level that is neither a known name nor a number in a
// lenient way ("12abc" is 12, "300" is 44, and without a level database a
// name may read as 0).  The tool wants a typo to be an error, so it checks
// the level field itself before handing the text over.
bool level_field_ok(const std::string &text, Refusal *why)
{
	const std::string field = text.substr(0, text.find_first_of(":!"));
	return field.empty() || resolve_level(field, why).has_value();
}

LabelPtr label_of_pid(std::string_view number, int *exit_code)
{
	const auto pid = parse_decimal(number, INT32_MAX);
	if (!pid) {
		report(number, "not a process number");
		*exit_code = kUsage;
		return nullptr;
	}
	LabelPtr l(vyr_get_pid(static_cast<int>(*pid)));
	if (!l) {
		report_errno("pid " + std::string(number), errno);
		*exit_code = kFailure;
	}
	return l;
}

} // namespace

LabelPtr read_label_arg(const std::string &arg, int *exit_code)
{
	*exit_code = kOk;
	if (arg.rfind("@pid:", 0) == 0)
		return label_of_pid(std::string_view(arg).substr(5), exit_code);
	if (arg.size() > 1 && arg[0] == '@') {
		const std::string path = arg.substr(1);
		LabelPtr l(vyr_get_path(path.c_str()));
		if (!l) {
			report_errno(path, errno);
			*exit_code = kFailure;
		}
		return l;
	}
	// An empty text would read as the zero label; that is almost always an
	// unset shell variable, so it is refused.  "0" or "!" say zero on purpose.
	if (arg.empty()) {
		report("''", "empty label text");
		*exit_code = kUsage;
		return nullptr;
	}
	Refusal why;
	if (!level_field_ok(arg, &why)) {
		report(arg, why.reason);
		*exit_code = why.exit;
		return nullptr;
	}
	errno = 0;
	LabelPtr l(vyrl_get_from_text(arg.c_str()));
	if (!l) {
		if (errno == ENOMEM) {
			report_errno(arg, errno);
			*exit_code = kFailure;
		} else {
			report(arg, "invalid label text");
			*exit_code = kUsage;
		}
	}
	return l;
}

std::optional<std::string> label_text(const vyrl_t *l, bool numeric)
{
	if (!numeric)
		if (auto named = take_string(vyrl_get_text(l, 0)))
			return named;
	return take_string(vyrl_get_text(l, VYR_TEXT_NUMERIC));
}

std::string level_text(uint8_t lev, bool numeric)
{
	if (!numeric)
		if (auto s = take_string(vyr_lev_get_text(lev, 0)))
			return *s;
	return std::to_string(lev);
}

std::string ilevel_text(uint8_t ilev, bool numeric)
{
	if (!numeric)
		if (auto s = take_string(vyr_ilev_get_text(ilev, 0)))
			return *s;
	return std::to_string(ilev);
}

std::string category_text(uint64_t cat, bool numeric)
{
	if (!numeric)
		if (auto s = take_string(vyr_cat_get_text(cat, 0)))
			return *s;
	char hex[24];
	std::snprintf(hex, sizeof hex, "0x%llx", static_cast<unsigned long long>(cat));
	return hex;
}

std::string type_text(uint16_t type, bool numeric)
{
	if (auto s = take_string(vyr_type_get_text(type, numeric ? VYR_TEXT_NUMERIC : 0)))
		return *s;
	return std::to_string(type);
}

std::string roles_text(const vyrrl_t *rl)
{
	return take_string(vyrrl_get_text(rl, 0)).value_or("?");
}

} // namespace vyr::tool
