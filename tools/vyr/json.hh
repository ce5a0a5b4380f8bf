// A small streaming JSON writer for the tool's --json output.
//
// Commas and nesting are tracked by the writer, so callers only say what
// comes next.  Strings are written as UTF-8; a byte that is not part of a
// valid UTF-8 sequence (paths may hold any bytes) is written as the code
// point of the same number, \u0080 to \u00ff, so the output is always valid
// JSON.
#pragma once

#include <vyr.h>

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace vyr::tool {

class JsonWriter {
public:
	void begin_object();
	void end_object();
	void begin_array();
	void end_array();
	// The key of the next member of the enclosing object.
	JsonWriter &key(std::string_view k);

	void string(std::string_view s);
	void number(uint64_t v);
	void number_signed(int64_t v);
	void boolean(bool b);
	void null();

	const std::string &text() const { return out_; }
	// Writes the document and a newline to stdout; false on a write error.
	bool print() const;

private:
	void before_value();

	std::string out_;
	std::vector<bool> first_; // per open container: nothing written yet
	bool after_key_ = false;
};

// Escaped JSON string literal, quotes included.
std::string json_quote(std::string_view s);

// A label as an object: "text", "numeric", the fields with their names, the
// role lists and the blob size.
void json_label(JsonWriter &j, const vyrl_t *l);

} // namespace vyr::tool
