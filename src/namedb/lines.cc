// Entry records and their one-line text form.
//
//   user:      name:lev1:cat1:lev2:cat2   levels decimal, masks hexadecimal
//   level:     name:value                 decimal
//   category:  name:value                 hexadecimal
//
// None of this touches a plug-in or converts a charset: bytes in, bytes out.

#include <vyr/namedb.h>

#include "contract/tavrel_aux.h"
#include "namedb/entries.hh"

#include <cctype>
#include <cerrno>
#include <climits>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace vyr::namedb {
namespace {

constexpr size_t kLineMax = 1024;     // stream line buffer, NUL included
constexpr size_t kHexBufSize = 30;    // what zenk_u64tostr writes into
constexpr unsigned long kLevelMax = 255;

bool is_space(char c) noexcept { return std::isspace(static_cast<unsigned char>(c)) != 0; }

char *skip_space(char *p) noexcept
{
	while (is_space(*p))
		++p;
	return p;
}

// Reads one number that starts at p (strtoul/strtoull rules: leading blanks,
// a sign, and for base 16 a 0x prefix are taken) and moves p behind it.
// A failed field leaves errno as the conversion left it: ERANGE after an
// overflow, else the caller's value. errno is cleared only around the call,
// so that a stale ERANGE can't make a legitimate all-ones value fail.
bool read_number(char *&p, int base, uint64_t &out) noexcept
{
	const int saved = errno;
	errno = 0;
	char *end = nullptr;
	const unsigned long long v = base == 10 ? std::strtoul(p, &end, 10) : std::strtoull(p, &end, 16);
	const bool overflow = v == ULLONG_MAX && errno == ERANGE;
	if (!overflow)
		errno = saved;
	if (overflow || end == p)
		return false;
	p = end;
	out = v;
	return true;
}

bool read_level(char *&p, uint8_t &out) noexcept
{
	uint64_t v = 0;
	if (!read_number(p, 10, v) || v > kLevelMax)
		return false;
	out = static_cast<uint8_t>(v);
	return true;
}

bool read_mask(char *&p, uint64_t &out) noexcept
{
	return read_number(p, 16, out);
}

// Between the numbers of a user line: optional blanks, then a colon.
bool read_colon(char *&p) noexcept
{
	p = skip_space(p);
	if (*p != ':') {
		errno = EINVAL;
		return false;
	}
	++p;
	return true;
}

// The numeric fields of each record kind, read from p into e.
bool read_fields(char *p, levent_t &e) noexcept { return read_level(p, e.value); }
bool read_fields(char *p, catent_t &e) noexcept { return read_mask(p, e.value); }
bool read_fields(char *p, macent_t &e) noexcept
{
	return read_level(p, e.lev1) && read_colon(p) && read_mask(p, e.cat1) && read_colon(p) &&
	       read_level(p, e.lev2) && read_colon(p) && read_mask(p, e.cat2);
}

// The opening shared by the three parsers: the name ends at the first colon
// or blank, which also serves as the separator before the first number.
// Fields read before a failure stay in the record; `name` is set only at
// the end, and then always (to NULL if its copy fails).
template <class E>
E *parse_line(const char *line, E *ent) noexcept
{
	if (!line || !ent) {
		errno = EINVAL;
		return nullptr;
	}
	char *copy = strdup(line);
	if (!copy)
		return nullptr;
	char *stop = copy;
	while (*stop && *stop != ':' && !is_space(*stop))
		++stop;
	if (!*stop) {
		std::free(copy);
		errno = EINVAL;
		return nullptr;
	}
	*stop = '\0';
	if (!read_fields(stop + 1, *ent)) {
		std::free(copy);
		return nullptr;
	}
	ent->name = strdup(copy);
	std::free(copy);
	return ent->name ? ent : nullptr;
}

// Formats with snprintf into a buffer that grows until the text fits; the
// final buffer is exactly the text's length plus its NUL.
template <class Format>
char *grow_format(Format &&format) noexcept
{
	size_t wanted = 1;
	char *buf = nullptr;
	for (;;) {
		const size_t size = wanted + 1;
		char *grown = static_cast<char *>(std::realloc(buf, size));
		if (!grown) {
			std::free(buf);
			return nullptr;
		}
		buf = grown;
		const int n = format(buf, size);
		if (n < 0) {
			std::free(buf);
			return nullptr;
		}
		if (size > static_cast<size_t>(n))
			return buf;
		wanted = static_cast<size_t>(n);
	}
}

struct HexText {
	char text[kHexBufSize] = {};
	explicit HexText(uint64_t v) noexcept { zenk_u64tostr(text, v, 16); }
};

char *compose_line(const levent_t &e) noexcept
{
	return grow_format([&](char *b, size_t n) { return std::snprintf(b, n, "%s:%u", e.name, unsigned{e.value}); });
}

char *compose_line(const catent_t &e) noexcept
{
	const HexText v(e.value);
	return grow_format([&](char *b, size_t n) { return std::snprintf(b, n, "%s:%s", e.name, v.text); });
}

char *compose_line(const macent_t &e) noexcept
{
	const HexText c1(e.cat1), c2(e.cat2);
	return grow_format([&](char *b, size_t n) {
		return std::snprintf(b, n, "%s:%u:%s:%u:%s", e.name, unsigned{e.lev1}, c1.text, unsigned{e.lev2},
				     c2.text);
	});
}

template <class E>
char *compose(const E *ent) noexcept
{
	if (!ent || !ent->name) {
		errno = EINVAL;
		return nullptr;
	}
	return compose_line(*ent);
}

// Next entry line of a stream: blank lines and lines whose first non-blank
// character is '#' are skipped. A bad line ends this call with NULL; the
// next call goes on with the line after it.
template <class E>
E *read_entry(FILE *fp) noexcept
{
	if (!fp) {
		errno = EINVAL;
		return nullptr;
	}
	char line[kLineMax];
	char *start = nullptr;
	do {
		if (!std::fgets(line, sizeof line, fp))
			return nullptr;
		start = skip_space(line);
	} while (*start == '\0' || *start == '#');

	const size_t len = std::strlen(start);
	if (start[len - 1] == '\n')
		start[len - 1] = '\0';

	E *ent = alloc_entry<E>();
	if (!ent)
		return nullptr;
	if (!parse_line(start, ent)) {
		std::free(ent); // its name was never set
		return nullptr;
	}
	return ent;
}

template <class E>
int write_entry(FILE *fp, const E *ent) noexcept
{
	if (!fp || !ent) {
		errno = EINVAL;
		return -1;
	}
	char *line = compose(ent);
	if (!line)
		return -1;
	const int r = std::fprintf(fp, "%s\n", line);
	std::free(line);
	return r;
}

} // namespace
} // namespace vyr::namedb

using namespace vyr::namedb;

extern "C" {

macent_t *parse_mac(const char *line, macent_t *ent) noexcept { return parse_line(line, ent); }
levent_t *parse_lev(const char *line, levent_t *ent) noexcept { return parse_line(line, ent); }
catent_t *parse_cat(const char *line, catent_t *ent) noexcept { return parse_line(line, ent); }

char *compose_mac(const macent_t *ent) noexcept { return compose(ent); }
char *compose_lev(const levent_t *ent) noexcept { return compose(ent); }
char *compose_cat(const catent_t *ent) noexcept { return compose(ent); }

macent_t *fgetmacent_r(FILE *fp) noexcept { return read_entry<macent_t>(fp); }
levent_t *fgetlevent_r(FILE *fp) noexcept { return read_entry<levent_t>(fp); }
catent_t *fgetcatent_r(FILE *fp) noexcept { return read_entry<catent_t>(fp); }

int fputmacent_r(FILE *fp, const macent_t *ent) noexcept { return write_entry(fp, ent); }
int fputlevent_r(FILE *fp, const levent_t *ent) noexcept { return write_entry(fp, ent); }
int fputcatent_r(FILE *fp, const catent_t *ent) noexcept { return write_entry(fp, ent); }

void freemacent_r(macent_t *ent) noexcept { free_entry(ent); }
void freelevent_r(levent_t *ent) noexcept { free_entry(ent); }
void freecatent_r(catent_t *ent) noexcept { free_entry(ent); }

} // extern "C"
