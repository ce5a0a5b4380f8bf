#include "lines.hh"

#include <cctype>
#include <cerrno>
#include <charconv>
#include <climits>
#include <cstdlib>

namespace vyr::files {
namespace {

enum class Field { Level, Mask };

struct Layout {
    std::array<Field, 4> fields;
    std::size_t count;
};

constexpr Layout layout_of(Db db) {
    switch (db) {
    case Db::Mac: return {{Field::Level, Field::Mask, Field::Level, Field::Mask}, 4};
    case Db::Lev: return {{Field::Level}, 1};
    case Db::Cat: return {{Field::Mask}, 1};
    }
    return {{}, 0};
}

bool is_space(char c) { return std::isspace(static_cast<unsigned char>(c)) != 0; }

// Reads one number starting at p, the way libvyr's parse_* functions do
// (leading blanks, a sign, "0x" in hexadecimal are accepted); the number
// must end within the line.
bool read_field(Field kind, const char* p, const char* line_end, std::uint64_t& value,
                const char*& next) {
    char* end = nullptr;
    errno = 0;
    if (kind == Field::Level) {
        const unsigned long v = std::strtoul(p, &end, 10);
        if (v == ULONG_MAX && errno == ERANGE) return false;
        if (end == p || end > line_end || v > 255) return false;
        value = v;
    } else {
        const unsigned long long v = std::strtoull(p, &end, 16);
        if (v == ULLONG_MAX && errno == ERANGE) return false;
        if (end == p || end > line_end) return false;
        value = v;
    }
    next = end;
    return true;
}

LineKind parse_fields(Db db, const char* p, const char* line_end, Entry& out) {
    const Layout layout = layout_of(db);
    for (std::size_t i = 0; i < layout.count; ++i) {
        if (!read_field(layout.fields[i], p, line_end, out.f[i], p)) return LineKind::Malformed;
        if (i + 1 == layout.count) break;  // anything after the last field is ignored
        while (p < line_end && is_space(*p)) ++p;
        if (p == line_end || *p != ':') return LineKind::Malformed;
        ++p;
    }
    return LineKind::Entry;
}

template <class T>
void append_number(std::string& out, T value, int base) {
    char buf[24];
    const auto res = std::to_chars(buf, buf + sizeof buf, value, base);
    out.append(buf, res.ptr);
}

}  // namespace

LineKind parse_line(Db db, std::string_view line, Entry& out) {
    const int saved = errno;
    std::size_t i = 0;
    while (i < line.size() && is_space(line[i])) ++i;
    if (i == line.size() || line[i] == '#') return LineKind::Empty;
    if (line.find('\0') != std::string_view::npos) return LineKind::Malformed;

    const std::size_t name_begin = i;
    while (i < line.size() && line[i] != ':' && !is_space(line[i])) ++i;
    if (i == line.size()) return LineKind::Malformed;  // no separator after the name
    out.name = line.substr(name_begin, i - name_begin);

    // One colon or one blank ends the name; the first number starts right
    // after it.
    const LineKind kind = parse_fields(db, line.data() + i + 1, line.data() + line.size(), out);
    errno = saved;
    return kind;
}

void compose_line(Db db, const Entry& e, std::string& out) {
    const Layout layout = layout_of(db);
    out.append(e.name);
    for (std::size_t i = 0; i < layout.count; ++i) {
        out.push_back(':');
        append_number(out, e.f[i], layout.fields[i] == Field::Level ? 10 : 16);
    }
}

bool storable(Db db, const Entry& e) {
    std::string line;
    compose_line(db, e, line);
    Entry back;
    if (parse_line(db, line, back) != LineKind::Entry) return false;
    return back.name == e.name && back.f == e.f && !e.name.empty();
}

}  // namespace vyr::files
