#include "dbroute_conf.hh"

#include <cerrno>
#include <charconv>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <unistd.h>

namespace vyr::dbroute {
namespace {

// How a value is checked and stored.
enum class Kind {
    Backend,  // plug-in name: no '/', no white space (it becomes part of a file name)
    Charset,  // iconv name: no white space
    Dir,      // absolute path
    Word,     // unsigned 32-bit number, decimal or 0x-hexadecimal
};

struct Key {
    std::string_view name;
    std::size_t offset;
    std::size_t size;  // capacity of a text field, NUL included
    Kind kind;
};

#define DBROUTE_TEXT_KEY(field, kind) \
    Key{#field, offsetof(dbroute_cfg_t, field), sizeof(dbroute_cfg_t::field), kind}

constexpr Key kKeys[] = {
    DBROUTE_TEXT_KEY(mac_backend, Kind::Backend),
    DBROUTE_TEXT_KEY(mac_charset, Kind::Charset),
    DBROUTE_TEXT_KEY(lev_backend, Kind::Backend),
    DBROUTE_TEXT_KEY(lev_charset, Kind::Charset),
    DBROUTE_TEXT_KEY(cat_backend, Kind::Backend),
    DBROUTE_TEXT_KEY(cat_charset, Kind::Charset),
    DBROUTE_TEXT_KEY(files_dir, Kind::Dir),
    DBROUTE_TEXT_KEY(mac_default_entry, Kind::Word),
};

#undef DBROUTE_TEXT_KEY

// Only ASCII blanks separate tokens: the file's meaning must not depend on
// the caller's locale.
constexpr bool is_blank(char c) {
    return c == ' ' || c == '\t' || c == '\r' || c == '\f' || c == '\v';
}

constexpr std::string_view trim(std::string_view s) {
    while (!s.empty() && is_blank(s.front())) s.remove_prefix(1);
    while (!s.empty() && is_blank(s.back())) s.remove_suffix(1);
    return s;
}

constexpr bool has_blank(std::string_view s) {
    for (char c : s)
        if (is_blank(c)) return true;
    return false;
}

const Key* find_key(std::string_view name) {
    for (const Key& k : kKeys)
        if (k.name == name) return &k;
    return nullptr;
}

bool fail(ConfError& error, int err, unsigned line, const char* what) {
    error = ConfError{err, line, what};
    return false;
}

// Parses a whole 32-bit word: decimal, or hexadecimal after "0x"/"0X".
bool parse_word(std::string_view text, std::uint32_t& out, int& err) {
    int base = 10;
    if (text.size() > 2 && text[0] == '0' && (text[1] == 'x' || text[1] == 'X')) {
        base = 16;
        text.remove_prefix(2);
    }
    const char* end = text.data() + text.size();
    auto [ptr, ec] = std::from_chars(text.data(), end, out, base);
    if (ec == std::errc::result_out_of_range) {
        err = ERANGE;
        return false;
    }
    if (ec != std::errc{} || ptr != end || text.empty()) {
        err = EINVAL;
        return false;
    }
    return true;
}

bool store_value(const Key& key, std::string_view value, dbroute_cfg_t& out, unsigned line,
                 ConfError& error) {
    auto* base = reinterpret_cast<unsigned char*>(&out);
    if (key.kind == Kind::Word) {
        std::uint32_t word = 0;
        int err = 0;
        if (!parse_word(value, word, err))
            return fail(error, err, line, "mac_default_entry must be an unsigned 32-bit number");
        std::memcpy(base + key.offset, &word, sizeof word);
        return true;
    }
    if (value.size() >= key.size) return fail(error, ENAMETOOLONG, line, "value too long for its field");
    switch (key.kind) {
    case Kind::Backend:
        if (value.find('/') != std::string_view::npos)
            return fail(error, EINVAL, line, "back-end name must not contain '/'");
        if (has_blank(value)) return fail(error, EINVAL, line, "back-end name must not contain blanks");
        break;
    case Kind::Charset:
        if (has_blank(value)) return fail(error, EINVAL, line, "charset name must not contain blanks");
        break;
    case Kind::Dir:
        if (value.empty() || value.front() != '/')
            return fail(error, EINVAL, line, "files_dir must be an absolute path");
        break;
    case Kind::Word:
        break;
    }
    char* field = reinterpret_cast<char*>(base + key.offset);
    std::memset(field, 0, key.size);
    std::memcpy(field, value.data(), value.size());
    return true;
}

bool parse_line(std::string_view raw, unsigned line, dbroute_cfg_t& out, ConfError& error) {
    std::string_view text = trim(raw);
    if (text.empty() || text.front() == '#') return true;
    if (text.find('\0') != std::string_view::npos)
        return fail(error, EINVAL, line, "NUL byte in configuration line");
    const std::size_t eq = text.find('=');
    if (eq == std::string_view::npos) return fail(error, EINVAL, line, "expected 'key = value'");
    const Key* key = find_key(trim(text.substr(0, eq)));
    if (key == nullptr) return fail(error, EINVAL, line, "unknown key");
    return store_value(*key, trim(text.substr(eq + 1)), out, line, error);
}

}  // namespace

bool parse_config(std::string_view text, dbroute_cfg_t& out, ConfError& error) noexcept {
    std::memset(&out, 0, sizeof out);
    unsigned line = 0;
    while (!text.empty()) {
        ++line;
        const std::size_t nl = text.find('\n');
        const std::string_view raw = text.substr(0, nl);
        if (!parse_line(raw, line, out, error)) return false;
        if (nl == std::string_view::npos) break;
        text.remove_prefix(nl + 1);
    }
    return true;
}

int read_config_file(const char* path, char** data, std::size_t* size) noexcept {
    const int fd = ::open(path, O_RDONLY | O_CLOEXEC | O_NOCTTY);
    if (fd < 0) return errno;
    char* buf = nullptr;
    std::size_t used = 0;
    std::size_t cap = 0;
    int err = 0;
    for (;;) {
        if (used == cap) {
            if (cap >= kMaxConfBytes) {
                err = EFBIG;
                break;
            }
            const std::size_t grown = cap == 0 ? 4096 : cap * 2;
            char* bigger = static_cast<char*>(std::realloc(buf, grown));
            if (bigger == nullptr) {
                err = errno;
                break;
            }
            buf = bigger;
            cap = grown;
        }
        const ssize_t n = ::read(fd, buf + used, cap - used);
        if (n < 0) {
            if (errno == EINTR) continue;
            err = errno;
            break;
        }
        if (n == 0) break;
        used += static_cast<std::size_t>(n);
    }
    ::close(fd);
    if (err != 0) {
        std::free(buf);
        return err;
    }
    *data = buf;
    *size = used;
    return 0;
}

}  // namespace vyr::dbroute
