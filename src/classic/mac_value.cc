// The classic label value: construction, accessors, comparison, permission
// test and the flat 24-byte form.

#include <vyr/classic.h>

#include "classic/mac_bits.hh"
#include "contract/tavrel_aux.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>

namespace vyr::classic {
namespace {

// Layout of the flat form.  Bytes 2-3 and 9-15 are neither written nor read.
constexpr uint16_t kExtMagic = 0x100;
constexpr size_t kExtMagicAt = 0;
constexpr size_t kExtTypeAt = 4;
constexpr size_t kExtLevAt = 8;
constexpr size_t kExtCatAt = 16;
static_assert(kExtCatAt + sizeof(uint64_t) == MAC_EXT_SIZE);

// Sets the type word and its mirrored low byte together: every writer of
// `type` goes through here so that `type_low` never falls out of step.
void store_type(mac_t &m, uint32_t type) noexcept {
    m.type = type;
    m.type_low = waivers(type);
}

// How two category masks relate, as the columns of the dominance table.
enum class CatRel { equal, a_in_b, b_in_a, apart };

CatRel relate(uint64_t a, uint64_t b) noexcept {
    if (a == b) return CatRel::equal;
    if ((a & b) == a) return CatRel::a_in_b;
    if ((a & b) == b) return CatRel::b_in_a;
    return CatRel::apart;
}

// One direction of access: the level test and the category test, each with
// the waiver bit that lifts it.
struct AccessRule {
    uint32_t request;
    uint32_t lev_waiver;
    uint32_t cat_waiver;
    bool lev_exact;  // write needs equal levels, read and execute only "not below"
    bool cat_exact;  // write needs equal masks, read and execute only "covers"
};

constexpr AccessRule kAccessRules[] = {
    {MAC_REQ_READ, MAC_WAIVE_LEV_READ, MAC_WAIVE_CAT_READ, false, false},
    {MAC_REQ_WRITE, MAC_WAIVE_LEV_WRITE, MAC_WAIVE_CAT_WRITE, true, true},
    {MAC_REQ_EXEC, MAC_WAIVE_LEV_EXEC, MAC_WAIVE_CAT_EXEC, false, false},
};

bool rule_permits(const AccessRule &r, const mac_t &s, const mac_t &o) noexcept {
    if (!(o.type & r.lev_waiver)) {
        bool ok = r.lev_exact ? s.lev == o.lev : s.lev >= o.lev;
        if (!ok) return false;
    }
    if (!(o.type & r.cat_waiver)) {
        bool ok = r.cat_exact ? s.cat == o.cat : (o.cat & s.cat) == o.cat;
        if (!ok) return false;
    }
    return true;
}

int permit(const mac_t *subject, const mac_t *object, uint32_t request) noexcept {
    if (!subject || !object) {
        errno = EINVAL;
        return -1;
    }
    for (const AccessRule &r : kAccessRules) {
        if ((request & r.request) && !rule_permits(r, *subject, *object)) return -1;
    }
    return 0;
}

}  // namespace

}  // namespace vyr::classic

using namespace vyr::classic;

extern "C" {

// Values are zero-filled, padding included, and copied byte for byte: a
// caller that writes a mac_t out as it lies in memory hands on no stale heap
// bytes.
mac_t *mac_init(uint32_t type) noexcept {
    auto *m = static_cast<mac_t *>(std::calloc(1, sizeof(mac_t)));
    if (!m) return nullptr;
    m->lev = 0;
    m->cat = 0;
    store_type(*m, type);  // deliberately untested: any word can be made
    return m;
}

mac_t *mac_dup(const mac_t *m) noexcept {
    if (!m) return nullptr;
    auto *copy = static_cast<mac_t *>(std::malloc(sizeof(mac_t)));
    if (copy) std::memcpy(copy, m, sizeof *copy);  // type_low travels along unchanged
    return copy;
}

void mac_free(mac_t *m) noexcept { std::free(m); }

int mac_valid(const mac_t *m) noexcept {
    // Only bit 0x10000 makes an object here, not the whole class field.
    if (m && (waivers(m->type) == 0 || (m->type & MAC_CLASS_OBJECT))) return 0;
    errno = EINVAL;
    return -1;
}

int mac_set_lev(mac_t *m, unsigned int lev) noexcept {
    if (!m) return -1;
    m->lev = static_cast<uint8_t>(lev);
    return 0;
}

int mac_set_cat(mac_t *m, uint64_t cat) noexcept {
    if (!m) return -1;
    m->cat = cat;
    return 0;
}

int mac_set_type(mac_t *m, uint32_t type) noexcept {
    if (!m) return -1;
    if (mac_class(type) == MAC_CLASS_SUBJECT && waivers(type) != 0) {
        errno = EINVAL;
        return -1;
    }
    store_type(*m, type);
    return 0;
}

uint8_t mac_get_lev(const mac_t *m) noexcept { return m ? m->lev : 0; }
uint64_t mac_get_cat(const mac_t *m) noexcept { return m ? m->cat : 0; }
uint32_t mac_get_type(const mac_t *m) noexcept { return m ? m->type : 0; }

int mac_copy(mac_t *dst, const mac_t *src) noexcept {
    if (!dst || !src) {
        errno = EINVAL;
        return -1;
    }
    dst->lev = src->lev;
    dst->cat = src->cat;
    // A subject never turns into an object or back: the type only follows
    // when both sides are of one class.  A refusal by the setter (a subject
    // source made with waiver bits) keeps dst's type, and the copy still
    // counts as done.
    if (mac_class(dst->type) == mac_class(src->type)) (void)mac_set_type(dst, src->type);
    return 0;
}

int mac_cmp(const mac_t *a, const mac_t *b) noexcept {
    if (!a && !b) return 0;
    if (!a || !b) return -2;
    if (waivers(a->type) != waivers(b->type)) return -2;

    CatRel rel = relate(a->cat, b->cat);
    if (a->lev == b->lev) {
        switch (rel) {
            case CatRel::equal: return 0;
            case CatRel::a_in_b: return -1;
            case CatRel::b_in_a: return 1;
            case CatRel::apart: return -2;
        }
    }
    if (a->lev < b->lev) return rel == CatRel::equal || rel == CatRel::a_in_b ? -1 : -2;
    return rel == CatRel::equal || rel == CatRel::b_in_a ? 1 : -2;
}

int mac_permit(const mac_t *subject, const mac_t *object, uint32_t request) noexcept {
    return permit(subject, object, request);
}

int mac_file_permit(const mac_t *subject, const mac_t *object, uint32_t request) noexcept {
    return permit(subject, object, request);
}

int mac_empty(const mac_t *m) noexcept {
    if (!m) return 0;
    return m->lev == 0 && m->cat == 0 && waivers(m->type) == 0 ? 0 : -1;
}

int64_t mac_size(const mac_t *m) noexcept {
    if (!m) {
        errno = EINVAL;
        return -1;
    }
    return MAC_EXT_SIZE;
}

int64_t mac_copy_ext(void *buf, const mac_t *m, uint64_t size) noexcept {
    if (!buf) {
        errno = EINVAL;
        return -1;
    }
    if (size < MAC_EXT_SIZE) {
        errno = ERANGE;
        return -1;
    }
    auto *bytes = static_cast<unsigned char *>(buf);
    zenk_set_w16(bytes + kExtMagicAt, kExtMagic);
    zenk_set_w8(bytes + kExtLevAt, mac_get_lev(m));
    zenk_set_w64(bytes + kExtCatAt, mac_get_cat(m));
    zenk_set_w32(bytes + kExtTypeAt, mac_get_type(m));
    return MAC_EXT_SIZE;
}

mac_t *mac_copy_int(const void *buf) noexcept {
    auto *bytes = static_cast<const unsigned char *>(buf);
    if (zenk_get_w16(bytes + kExtMagicAt) != kExtMagic) {
        errno = EINVAL;
        return nullptr;
    }
    mac_t *m = mac_init(zenk_get_w32(bytes + kExtTypeAt));
    if (!m) return nullptr;
    mac_set_lev(m, zenk_get_w8(bytes + kExtLevAt));
    mac_set_cat(m, zenk_get_w64(bytes + kExtCatAt));
    return m;
}

}  // extern "C"
