// Text form of the classic label value: up to three fields, level, category
// mask and type word, joined by ":".

#include <vyr/classic.h>
#include <vyr/namedb.h>
#include <vyr/text.h>

#include "classic/mac_bits.hh"
#include "classic/mac_text.hh"
#include "contract/tavrel_aux.h"

#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <cwchar>
#include <memory>
#include <optional>

namespace vyr::classic {
namespace {

// ---- owners of what the databases and the allocator hand out -------------

struct FreeDeleter {
    void operator()(void *p) const noexcept { std::free(p); }
};
template <class T>
using Owned = std::unique_ptr<T, FreeDeleter>;

struct LevEntryDeleter {
    void operator()(levent_t *e) const noexcept { freelevent_r(e); }
};
using LevEntry = std::unique_ptr<levent_t, LevEntryDeleter>;

struct CatEntryDeleter {
    void operator()(catent_t *e) const noexcept { freecatent_r(e); }
};
using CatEntry = std::unique_ptr<catent_t, CatEntryDeleter>;

// An open database handle, closed when the owner goes.  A missing handle is
// a normal state: every caller here can do without names.
template <void *(*Open)(), int (*Close)(void *)>
class Db {
public:
    Db() noexcept : h_(Open()) {}
    ~Db() { close(); }
    Db(const Db &) = delete;
    Db &operator=(const Db &) = delete;

    void *get() const noexcept { return h_; }
    explicit operator bool() const noexcept { return h_ != nullptr; }
    void close() noexcept {
        if (h_) (void)Close(h_);
        h_ = nullptr;
    }

private:
    void *h_;
};
using LevDb = Db<openlevdb_r, closelevdb_r>;
using CatDb = Db<opencatdb_r, closecatdb_r>;

// A copy of `text` from malloc, as strdup makes it.  Spelled out so that the
// copy comes from the very allocator every other block of the library comes
// from, even where a tool replaces strdup with its own.
char *copy_text(const char *text) noexcept {
    size_t size = std::strlen(text) + 1;
    auto *copy = static_cast<char *>(std::malloc(size));
    if (copy) std::memcpy(copy, text, size);
    return copy;
}

// ---- output: one routine serves measuring and writing ---------------------

// Collects printf pieces.  Without a buffer it only sums their lengths; with
// one it stores each piece at the current place, cut to the room left, and
// never writes past the end.  length() is the sum in both modes.
class Sink {
public:
    Sink() noexcept = default;
    Sink(char *buf, size_t size) noexcept : at_(buf), room_(size) {
        if (at_ && room_) *at_ = '\0';
    }

    bool writing() const noexcept { return at_ != nullptr && room_ != 0; }
    char *at() const noexcept { return writing() ? at_ : nullptr; }
    size_t room() const noexcept { return writing() ? room_ : 0; }
    size_t length() const noexcept { return length_; }

    template <class... Args>
    void put(const char *fmt, Args... args) noexcept {
        if (!writing()) {
            int n = std::snprintf(nullptr, 0, fmt, args...);
            length_ += n > 0 ? static_cast<size_t>(n) : 0;
            return;
        }
        int n = zenk_scnprintf(at_, room_, fmt, args...);
        advance(n > 0 ? static_cast<size_t>(n) : 0);
    }

    // Accounts for text that a helper stored at at() (or measured) itself.
    void advance(size_t n) noexcept {
        length_ += n;
        if (!writing()) return;
        // zenk_scnprintf never stores more than room - 1: room stays >= 1.
        n = n < room_ ? n : room_ - 1;
        at_ += n;
        room_ -= n;
    }

private:
    char *at_ = nullptr;
    size_t room_ = 0;
    size_t length_ = 0;
};

// ---- field selection --------------------------------------------------------

struct Fields {
    bool lev, cat, type, names;
};

constexpr int kFieldFlags = MAC_TEXT_LEV | MAC_TEXT_CAT | MAC_TEXT_TYPE;

Fields select_fields(const mac_t &m, int flags) noexcept {
    bool names = (flags & MAC_TEXT_NAMES) != 0;
    if (flags & kFieldFlags)
        return {(flags & MAC_TEXT_LEV) != 0, (flags & MAC_TEXT_CAT) != 0, (flags & MAC_TEXT_TYPE) != 0, names};
    // By default the type shows only where it says something: an object
    // with waivers.
    bool type = mac_class(m.type) == MAC_CLASS_OBJECT && waivers(m.type) != 0;
    return {true, true, type, names};
}

// ---- type names -------------------------------------------------------------

// The name of a whole type word, or the six-letter waiver form.  Writes into
// `out`, which holds at least kLetterFormLen + 1 bytes.
const char *type_name(uint32_t type, char *out) noexcept {
    for (const TypeName &t : kTypeNames)
        if (t.value == type) return t.name.data();
    size_t i = 0;
    for (const LetterSlot &s : kLetterSlots) out[i++] = (type & s.bit) ? s.letter : '-';
    out[i] = '\0';
    return out;
}

// Reads the letter form: each position holds its own letter or "-", and
// positions past the sixth only "-".  Partial forms, the empty one included,
// are fine.
bool parse_letters(const char *field, uint32_t &bits) noexcept {
    uint32_t v = 0;
    for (size_t i = 0; field[i]; ++i) {
        if (field[i] == '-') continue;
        if (i >= kLetterFormLen || field[i] != kLetterSlots[i].letter) return false;
        v |= kLetterSlots[i].bit;
    }
    bits = v;
    return true;
}

bool parse_type(const char *field, uint32_t &type) noexcept {
    for (const TypeName &t : kTypeNames) {
        if (t.name == field) {
            type = t.value;
            return true;
        }
    }
    uint32_t bits = 0;
    if (parse_letters(field, bits)) {
        type = bits | MAC_CLASS_OBJECT;
        return true;
    }
    // A number always makes an object, whatever class it carried.
    char *end = nullptr;
    unsigned long v = std::strtoul(field, &end, 16);
    if (*end != '\0') return false;
    type = static_cast<uint32_t>(v) | MAC_CLASS_OBJECT;
    return true;
}

// ---- level field ------------------------------------------------------------

// A level name first, else a decimal number of at most 255 with nothing
// behind it.  The database is closed before the entry is read.
bool parse_level(const char *field, uint8_t &lev) noexcept {
    LevEntry entry;
    {
        LevDb db;
        if (db) entry.reset(getlevnam_r(db.get(), field));
    }
    if (entry) {
        lev = entry->value;
        return true;
    }
    char *end = nullptr;
    unsigned long v = std::strtoul(field, &end, 10);
    if (*end != '\0' || v > UINT8_MAX) return false;
    lev = static_cast<uint8_t>(v);
    return true;
}

// Cuts `s` at its first ":" and returns what follows, or NULL without one.
char *split(char *s) noexcept {
    char *colon = s ? std::strchr(s, ':') : nullptr;
    if (!colon) return nullptr;
    *colon = '\0';
    return colon + 1;
}

// ---- the writer ---------------------------------------------------------------

// Everything that both passes of mac_to_text share, held for the whole call.
struct TextPlan {
    const mac_t &m;
    Fields f;
    LevEntry lev_entry;
    Owned<char> type_text;  // only with names and a type field
};

// Level and category, with the separators before the category and the type.
void emit_head(Sink &out, const TextPlan &p) noexcept {
    if (p.f.lev) {
        if (p.lev_entry)
            out.put("%s", p.lev_entry->name);
        else
            out.put("%d", static_cast<int>(p.m.lev));
    }
    if (p.f.lev && p.f.cat) out.put("%s", ":");
    if (p.f.cat) {
        if (p.f.names)
            out.advance(static_cast<size_t>(mac_cat_to_buf(p.m.cat, out.at(), out.room())));
        else
            out.put("%lx", static_cast<unsigned long>(p.m.cat));
    }
    if (p.f.type && (p.f.lev || p.f.cat)) out.put("%s", ":");
}

// The type, whose name is only copied once everything before it is measured.
void emit_tail(Sink &out, const TextPlan &p) noexcept {
    if (!p.f.type) return;
    if (p.type_text)
        out.put("%s", p.type_text.get());
    else
        out.put("%x", static_cast<unsigned>(p.m.type));
}

char *to_text(const mac_t *label, size_t *len, int flags) noexcept {
    if (mac_valid(label) != 0) return nullptr;  // errno EINVAL, *len untouched

    const Fields fields = select_fields(*label, flags);
    size_t measured = 0;
    // Whatever happens below, the caller learns how far measuring got, once
    // everything else is released (objects below go first, in reverse).
    struct Report {
        size_t *len;
        const size_t &measured;
        ~Report() {
            if (len) *len = measured;
        }
    } report{len, measured};

    // The level entry is looked up once and held for both passes; the
    // database closes after the entry and the type text are released.
    std::optional<LevDb> lev_db;
    TextPlan plan{*label, fields, {}, {}};
    if (plan.f.names && plan.f.lev) {
        lev_db.emplace();
        if (!*lev_db) return nullptr;  // names asked for and none to be had
        plan.lev_entry.reset(getlevval_r(lev_db->get(), label->lev));
    }

    Sink measure;
    emit_head(measure, plan);
    measured = measure.length();
    if (plan.f.names && plan.f.type) {
        char letters[kLetterFormLen + 1];
        plan.type_text.reset(copy_text(type_name(label->type, letters)));
        if (!plan.type_text) return nullptr;
    }
    emit_tail(measure, plan);
    measured = measure.length();

    auto *buf = static_cast<char *>(std::malloc(measured + 1));
    if (!buf) return nullptr;
    Sink write(buf, measured + 1);
    emit_head(write, plan);
    emit_tail(write, plan);
    return buf;
}

int from_text(mac_t *label, const char *text) noexcept {
    if (!text) return 0;
    if (!label) return -1;
    Owned<char> copy(copy_text(text));
    if (!copy) return -1;

    char *lev_field = copy.get();
    char *cat_field = split(lev_field);
    char *type_field = split(cat_field);  // keeps any further ":"

    uint8_t lev = 0;
    uint64_t cat = 0;
    bool ok = parse_level(lev_field, lev);
    if (ok && cat_field) ok = vyr_cat_from_text_nc(cat_field, &cat) == 0;
    if (ok && type_field) {
        uint32_t type = 0;
        ok = parse_type(type_field, type) && mac_set_type(label, type) == 0;
    }
    if (!ok) {
        errno = EINVAL;
        return -1;
    }
    // Only now, so that a failure above leaves the value as it was.
    mac_set_lev(label, lev);
    mac_set_cat(label, cat);
    return 0;
}

}  // namespace

int64_t mac_cat_to_buf(uint64_t cat, char *buf, size_t size) noexcept {
    Sink out(buf, size);
    CatDb db;
    uint64_t rest = cat;

    // A mask with an entry of its own is that one name, mask 0 included.
    if (db) {
        if (CatEntry exact{getcatval_r(db.get(), cat)}) {
            out.put("%s", exact->name);
            rest &= ~exact->value;
            if (rest == 0) return static_cast<int64_t>(out.length());
        }
    }
    if (rest == 0) {  // mask 0 and no entry for it
        out.put("0x%lx", static_cast<unsigned long>(cat));
        return static_cast<int64_t>(out.length());
    }
    if (db) {
        (void)setcatent_r(db.get());
        while (rest != 0) {
            CatEntry e{getcatent_r(db.get())};
            if (!e) break;
            if (e->value == 0 || (e->value & ~rest) != 0) continue;
            out.put(out.length() == 0 ? "%s" : ",%s", e->name);
            rest &= ~e->value;
        }
        (void)endcatent_r(db.get());
    }
    if (rest != 0) out.put(out.length() == 0 ? "0x%lx" : ",0x%lx", static_cast<unsigned long>(rest));
    return static_cast<int64_t>(out.length());
}

}  // namespace vyr::classic

extern "C" {

char *mac_to_text(const mac_t *m, size_t *len, int flags) noexcept {
    return vyr::classic::to_text(m, len, flags);
}

wchar_t *mac_to_wtext(const mac_t *m, size_t *len, int flags) noexcept {
    if (len) *len = 0;
    char *narrow = mac_to_text(m, nullptr, flags);
    if (!narrow) return nullptr;
    wchar_t *wide = zenk_string_towc(narrow);
    std::free(narrow);
    if (wide && len) *len = std::wcslen(wide);
    return wide;
}

int mac_from_text(mac_t *m, const char *text) noexcept { return vyr::classic::from_text(m, text); }

}  // extern "C"
