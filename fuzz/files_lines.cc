// Fuzz target: the files back-end's line reader and writer.
// The first byte picks the database, the rest is a database file. Every line
// must classify without a crash, and every entry that the writer accepts
// must read back as exactly the same entry.
#include <cstddef>
#include <cstdint>
#include <string>

#include "lines.hh"

using vyr::files::Db;
using vyr::files::Entry;
using vyr::files::LineKind;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    if (size == 0) return 0;
    const Db db = static_cast<Db>(data[0] % 3);
    const std::string text(reinterpret_cast<const char*>(data + 1), size - 1);  // keeps a NUL after the end
    vyr::files::for_each_line(db, text, [db](std::size_t, std::string_view, LineKind kind, const Entry& e) {
        if (kind != LineKind::Entry) return true;
        if (!vyr::files::storable(db, e)) return true;
        std::string line;
        vyr::files::compose_line(db, e, line);
        Entry back;
        if (vyr::files::parse_line(db, line, back) != LineKind::Entry) __builtin_trap();
        if (back.name != e.name || back.f != e.f) __builtin_trap();
        return true;
    });
    return 0;
}
