// raw encode / raw decode: label text to the portable whole-label byte form
// and back, through stdout and stdin.
#include "commands.hh"
#include "json.hh"

#include <cerrno>
#include <cstdio>
#include <string>
#include <vector>

#include <unistd.h>

namespace vyr::tool {

namespace {

const std::vector<OptionDef> kRawOptions = {
    {0, "hex", false},
    {'n', "numeric", false},
};

bool read_all(FILE *in, std::vector<uint8_t> *out)
{
	uint8_t buf[4096];
	size_t n;
	while ((n = std::fread(buf, 1, sizeof buf, in)) > 0)
		out->insert(out->end(), buf, buf + n);
	return !std::ferror(in);
}

// Hexadecimal text to bytes; blanks and newlines between byte pairs are
// allowed.  false for any other character or an odd digit count.
bool from_hex(const std::vector<uint8_t> &text, std::vector<uint8_t> *out)
{
	int high = -1;
	for (uint8_t c : text) {
		if (c == ' ' || c == '\n' || c == '\t' || c == '\r')
			continue;
		int v;
		if (c >= '0' && c <= '9')
			v = c - '0';
		else if (c >= 'a' && c <= 'f')
			v = c - 'a' + 10;
		else if (c >= 'A' && c <= 'F')
			v = c - 'A' + 10;
		else
			return false;
		if (high < 0) {
			high = v;
		} else {
			out->push_back(static_cast<uint8_t>(high << 4 | v));
			high = -1;
		}
	}
	return high < 0;
}

int encode(const Args &args)
{
	if (args.positional.size() != 2)
		return usage_error("raw", args.positional.size() < 2 ? "missing LABEL"
		                                                     : "too many arguments");
	int status;
	LabelPtr l = read_label_arg(args.positional[1], &status);
	if (!l)
		return status;
	uint64_t size = 0;
	CPtr<uint8_t> bytes(vyrl_get_raw(l.get(), &size));
	if (!bytes) {
		report_errno("raw encode", errno);
		return kFailure;
	}
	if (args.json) {
		JsonWriter j;
		std::string hex;
		char two[3];
		for (uint64_t i = 0; i < size; ++i) {
			std::snprintf(two, sizeof two, "%02x", bytes.get()[i]);
			hex += two;
		}
		j.begin_object();
		j.key("size").number(size);
		j.key("hex").string(hex);
		j.end_object();
		j.print();
		return kOk;
	}
	if (args.has("hex")) {
		for (uint64_t i = 0; i < size; ++i)
			std::printf("%02x", bytes.get()[i]);
		std::printf("\n");
		return kOk;
	}
	if (isatty(STDOUT_FILENO)) {
		report("raw encode", "refusing to write bytes to a terminal (use --hex)");
		return kFailure;
	}
	if (std::fwrite(bytes.get(), 1, size, stdout) != size) {
		report_errno("standard output", errno);
		return kFailure;
	}
	return kOk;
}

int decode(const Args &args)
{
	if (args.positional.size() != 1)
		return usage_error("raw", "decode reads standard input and takes no arguments");
	std::vector<uint8_t> input;
	if (!read_all(stdin, &input)) {
		report_errno("standard input", errno);
		return kFailure;
	}
	std::vector<uint8_t> bytes;
	if (!args.has("hex"))
		bytes = std::move(input);
	else if (!from_hex(input, &bytes)) {
		report("standard input", "not hexadecimal text");
		return kFailure;
	}
	// The form must be complete and nothing may follow it.
	if (bytes.size() < VYRL_RAW_MIN_SIZE || vyrrawl_size(bytes.data()) != bytes.size()) {
		report("standard input", "not a whole-label raw form (" +
		                             std::to_string(bytes.size()) + " bytes)");
		return kFailure;
	}
	LabelPtr l(vyrl_get_from_raw(bytes.data(), bytes.size()));
	if (!l) {
		report("standard input", errno == ENOMEM ? "out of memory"
		                                         : "not a whole-label raw form");
		return kFailure;
	}
	if (args.json) {
		JsonWriter j;
		json_label(j, l.get());
		j.print();
		return kOk;
	}
	const auto text = label_text(l.get(), args.has("numeric"));
	if (!text) {
		report_errno("raw decode", ENOMEM);
		return kFailure;
	}
	std::printf("%s\n", text->c_str());
	return kOk;
}

} // namespace

int cmd_raw(int argc, char **argv)
{
	Args args;
	int status;
	if (!parse_command(argc, argv, kRawOptions, false, &args, &status))
		return status;
	if (args.positional.empty())
		return usage_error("raw", "missing 'encode' or 'decode'");
	const std::string &verb = args.positional[0];
	if (verb == "encode")
		return encode(args);
	if (verb == "decode")
		return decode(args);
	return usage_error("raw", "unknown action '" + verb + "'");
}

} // namespace vyr::tool
