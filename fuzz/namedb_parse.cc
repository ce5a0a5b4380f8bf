// Fuzz target for the entry line parsers (parse_mac, parse_lev, parse_cat)
// and the stream readers (fget*ent_r, and the wide wcfget*ent).
//
// The input is parsed as one line by each parser; what parses must hold a
// name free of separators and, composed again, must parse back to the same
// record. The input is then read as a stream of entry lines until its end.
#include <vyr/namedb.h>

#include <cctype>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <type_traits>
#include <cstring>
#include <string>
#include <cwctype>

namespace {

void check_name(const char *name)
{
	if (!name)
		return; // out of memory
	for (const char *p = name; *p; ++p)
		if (*p == ':' || std::isspace(static_cast<unsigned char>(*p)))
			std::abort();
}

bool same(const macent_t &a, const macent_t &b)
{
	return std::strcmp(a.name, b.name) == 0 && a.lev1 == b.lev1 && a.cat1 == b.cat1 && a.lev2 == b.lev2 &&
	       a.cat2 == b.cat2;
}
bool same(const levent_t &a, const levent_t &b) { return std::strcmp(a.name, b.name) == 0 && a.value == b.value; }
bool same(const catent_t &a, const catent_t &b) { return std::strcmp(a.name, b.name) == 0 && a.value == b.value; }

template <class E, class Parse, class Compose>
void round_trip(const char *line, Parse parse, Compose compose)
{
	E e{};
	if (!parse(line, &e))
		return;
	check_name(e.name);
	if (char *text = compose(&e)) {
		E back{};
		if (parse(text, &back)) {
			if (!same(e, back))
				std::abort();
			std::free(back.name);
		} else if (errno != ENOMEM) {
			std::abort(); // a composed line always parses
		}
		std::free(text);
	}
	std::free(e.name);
}

void check_wide_name(const wchar_t *name)
{
	if (!name)
		return; // out of memory or not convertible
	for (const wchar_t *p = name; *p; ++p)
		if (*p == L':' || std::iswspace(static_cast<wint_t>(*p)))
			std::abort();
}

// Reads every entry of the input as a stream, checks each name and releases
// the entry; a release that reports failure is a fault.
template <class E, class Read, class Release, class Check>
void read_stream(const uint8_t *data, size_t size, Read read, Release release, Check check)
{
	if (size == 0)
		return;
	FILE *fp = fmemopen(const_cast<uint8_t *>(data), size, "r");
	if (!fp)
		return;
	// Each call consumes at least one line, so this ends.
	while (!std::feof(fp) && !std::ferror(fp)) {
		if (E *e = read(fp)) {
			check(e->name);
			if constexpr (!std::is_void_v<decltype(release(e))>) {
				if (release(e) != 0)
					std::abort();
			} else {
				release(e);
			}
		}
	}
	std::fclose(fp);
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size)
{
	const std::string line(reinterpret_cast<const char *>(data), size); // cut at the first NUL by the parsers
	round_trip<macent_t>(line.c_str(), parse_mac, compose_mac);
	round_trip<levent_t>(line.c_str(), parse_lev, compose_lev);
	round_trip<catent_t>(line.c_str(), parse_cat, compose_cat);

	read_stream<macent_t>(data, size, fgetmacent_r, freemacent_r, check_name);
	read_stream<levent_t>(data, size, fgetlevent_r, freelevent_r, check_name);
	read_stream<catent_t>(data, size, fgetcatent_r, freecatent_r, check_name);

	// The wide stream readers: the same lines, names made wide (a name that
	// does not convert comes back as NULL).
	read_stream<wcmacent_t>(data, size, wcfgetmacent, wcfreemacent, check_wide_name);
	read_stream<wclevent_t>(data, size, wcfgetlevent, wcfreelevent, check_wide_name);
	read_stream<wccatent_t>(data, size, wcfgetcatent, wcfreecatent, check_wide_name);
	return 0;
}
