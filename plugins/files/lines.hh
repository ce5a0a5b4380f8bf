// Line format of the files back-end: one entry per line, fields separated by
// colons, exactly as libvyr's stream readers and writers use them:
//
//   users       name:lev1:cat1:lev2:cat2     levels decimal, masks hexadecimal
//   levels      name:value                   value decimal, 0..255
//   categories  name:value                   value hexadecimal, 64 bits
//
// Blank lines and lines whose first non-blank character is '#' carry no
// entry. This reader works on views into a caller's buffer and allocates
// nothing, so it can run over a whole file without copying it.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace vyr::files {

enum class Db { Mac, Lev, Cat };

// One parsed entry. `name` views the buffer it was read from. Unused fields
// stay 0: Lev and Cat have one value (f[0]), Mac has lev1, cat1, lev2, cat2.
struct Entry {
    std::string_view name;
    std::array<std::uint64_t, 4> f{};
};

enum class LineKind { Empty, Entry, Malformed };

// Classifies one line (without its newline). `line` must be followed in
// memory by a NUL or by a character that cannot continue a number (the
// newline of the file buffer qualifies), because numbers are read with the C
// library's strtoul family, which needs a terminator.
LineKind parse_line(Db db, std::string_view line, Entry& out);

// Appends the line for `e` (no newline) to `out`. May throw std::bad_alloc.
void compose_line(Db db, const Entry& e, std::string& out);

// Whether `e` can be stored: its composed line reads back as the same
// entry. Names that are empty, hold colons or blanks, or start with '#'
// fail this test. May throw std::bad_alloc.
bool storable(Db db, const Entry& e);

// Calls fn(line_number, line, kind, entry) for every line of `text`, which
// must be NUL-terminated just past its end (std::string guarantees that).
// Stops early and returns false as soon as fn returns false.
template <class F>
bool for_each_line(Db db, std::string_view text, F&& fn) {
    std::size_t number = 0;
    while (!text.empty()) {
        ++number;
        const std::size_t nl = text.find('\n');
        const std::string_view line = text.substr(0, nl);
        Entry e;
        const LineKind kind = parse_line(db, line, e);
        if (!fn(number, line, kind, e)) return false;
        if (nl == std::string_view::npos) break;
        text.remove_prefix(nl + 1);
    }
    return true;
}

}  // namespace vyr::files
