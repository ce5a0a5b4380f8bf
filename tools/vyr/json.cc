#include "json.hh"

#include "cli.hh"

#include <cstdio>

namespace vyr::tool {

namespace {

// Length of the valid UTF-8 sequence at s[i], or 0 if there is none.
size_t utf8_sequence(std::string_view s, size_t i)
{
	const auto b = static_cast<unsigned char>(s[i]);
	size_t len;
	uint32_t cp;
	if (b < 0x80)
		return 1;
	if (b >= 0xc2 && b <= 0xdf) {
		len = 2;
		cp = b & 0x1f;
	} else if (b >= 0xe0 && b <= 0xef) {
		len = 3;
		cp = b & 0x0f;
	} else if (b >= 0xf0 && b <= 0xf4) {
		len = 4;
		cp = b & 0x07;
	} else {
		return 0;
	}
	if (i + len > s.size())
		return 0;
	for (size_t k = 1; k < len; ++k) {
		const auto c = static_cast<unsigned char>(s[i + k]);
		if ((c & 0xc0) != 0x80)
			return 0;
		cp = (cp << 6) | (c & 0x3f);
	}
	// Overlong forms, surrogates and values past U+10FFFF are not UTF-8.
	if ((len == 3 && cp < 0x800) || (len == 4 && cp < 0x10000) || cp > 0x10ffff ||
	    (cp >= 0xd800 && cp <= 0xdfff))
		return 0;
	return len;
}

void append_u_escape(std::string &out, unsigned v)
{
	char buf[8];
	std::snprintf(buf, sizeof buf, "\\u%04x", v);
	out += buf;
}

} // namespace

std::string json_quote(std::string_view s)
{
	std::string out;
	out.reserve(s.size() + 2);
	out += '"';
	for (size_t i = 0; i < s.size();) {
		const auto c = static_cast<unsigned char>(s[i]);
		if (c == '"' || c == '\\') {
			out += '\\';
			out += static_cast<char>(c);
			++i;
		} else if (c == '\n') {
			out += "\\n";
			++i;
		} else if (c == '\t') {
			out += "\\t";
			++i;
		} else if (c < 0x20) {
			append_u_escape(out, c);
			++i;
		} else if (c < 0x80) {
			out += static_cast<char>(c);
			++i;
		} else if (size_t n = utf8_sequence(s, i); n != 0) {
			out.append(s.substr(i, n));
			i += n;
		} else {
			append_u_escape(out, c);
			++i;
		}
	}
	out += '"';
	return out;
}

void JsonWriter::before_value()
{
	if (after_key_) {
		after_key_ = false;
		return;
	}
	if (!first_.empty()) {
		if (!first_.back())
			out_ += ',';
		first_.back() = false;
	}
}

void JsonWriter::begin_object()
{
	before_value();
	out_ += '{';
	first_.push_back(true);
}

void JsonWriter::end_object()
{
	first_.pop_back();
	out_ += '}';
}

void JsonWriter::begin_array()
{
	before_value();
	out_ += '[';
	first_.push_back(true);
}

void JsonWriter::end_array()
{
	first_.pop_back();
	out_ += ']';
}

JsonWriter &JsonWriter::key(std::string_view k)
{
	before_value();
	out_ += json_quote(k);
	out_ += ':';
	after_key_ = true;
	return *this;
}

void JsonWriter::string(std::string_view s)
{
	before_value();
	out_ += json_quote(s);
}

void JsonWriter::number(uint64_t v)
{
	before_value();
	out_ += std::to_string(v);
}

void JsonWriter::number_signed(int64_t v)
{
	before_value();
	out_ += std::to_string(v);
}

void JsonWriter::boolean(bool b)
{
	before_value();
	out_ += b ? "true" : "false";
}

void JsonWriter::null()
{
	before_value();
	out_ += "null";
}

bool JsonWriter::print() const
{
	return std::fwrite(out_.data(), 1, out_.size(), stdout) == out_.size() &&
	       std::fputc('\n', stdout) != EOF;
}

namespace {

void json_roles(JsonWriter &j, const vyr_role_t *roles, uint32_t n)
{
	j.begin_array();
	for (uint32_t i = 0; roles != nullptr && i < n; ++i)
		j.number(roles[i].id);
	j.end_array();
}

// A name from the databases, or null where the value has none.
void json_name(JsonWriter &j, char *owned)
{
	if (auto s = take_string(owned))
		j.string(*s);
	else
		j.null();
}

} // namespace

void json_label(JsonWriter &j, const vyrl_t *l)
{
	const vyrml_t *ml = vyrl_ml(l);
	const vyrrl_t *rl = vyrl_rl(l);
	char hex[24];

	j.begin_object();
	j.key("text").string(label_text(l, false).value_or(""));
	j.key("numeric").string(label_text(l, true).value_or(""));
	j.key("lev").number(vyrml_lev(ml));
	// vyr_lev_get_text gives NULL for a level without a name at flags 0.
	j.key("lev_name");
	json_name(j, vyr_lev_get_text(vyrml_lev(ml), 0));
	j.key("ilev").number(vyrml_ilev(ml));
	j.key("cat");
	std::snprintf(hex, sizeof hex, "0x%llx", static_cast<unsigned long long>(vyrml_cat(ml)));
	j.string(hex);
	j.key("cat_text").string(category_text(vyrml_cat(ml), false));
	j.key("type").number(vyrml_type(ml));
	j.key("type_text").string(type_text(vyrml_type(ml), false));
	j.key("blob_size").number(ml->blob_size);
	j.key("roles1");
	json_roles(j, rl->roles1, rl->nroles1);
	j.key("roles2");
	json_roles(j, rl->roles2, rl->nroles2);
	j.end_object();
}

} // namespace vyr::tool
