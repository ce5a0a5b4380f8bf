// Raw label forms: packed little-endian byte strings of the label records.
//
// Every multi-byte field goes through the auxiliary library's byte-order
// functions and is moved with memcpy, since the forms are packed and fields
// lie at any alignment.  Readers check every length before they look at any
// byte beyond the fixed head that the check covers, so no reader touches a
// byte at or past `len`.

#include <vyr/label.h>
#include <vyr/raw.h>

#include "contract/tavrel_aux.h"

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <type_traits>

extern "C" {
const uint64_t VYRL_RAW_MIN_SIZE = 26;
const uint64_t VYRLM_RAW_MIN_SIZE = 18;
const uint64_t VYRRL_RAW_MIN_SIZE = 11;
}

namespace vyr::repr {
namespace {

constexpr uint16_t kVersion = 1;
constexpr uint64_t kRoleRawSize = 13;

// Field offsets shared by the mandatory-part form and the head of the
// whole-label form, which starts with the same 18 bytes.
constexpr size_t kOffVersion = 0;
constexpr size_t kOffType = 2;
constexpr size_t kOffLev = 4;
constexpr size_t kOffIlev = 5;
constexpr size_t kOffCat = 6;
constexpr size_t kOffBlobSize = 14;
constexpr size_t kMlHead = 18;

// Whole-label form: the two role counts follow the mandatory head.
constexpr size_t kOffLblNroles1 = 18;
constexpr size_t kOffLblNroles2 = 22;
constexpr size_t kLblHead = 26;

// Role-part form.
constexpr size_t kOffRlReserved = 2;
constexpr size_t kOffRlNroles1 = 3;
constexpr size_t kOffRlNroles2 = 7;
constexpr size_t kRlHead = 11;

// Role entry.
constexpr size_t kOffRoleId = 0;
constexpr size_t kOffRoleAttr = 8;
constexpr size_t kOffRoleRights = 12;

static_assert(kMlHead == kOffBlobSize + 4);
static_assert(kLblHead == kOffLblNroles2 + 4);
static_assert(kRlHead == kOffRlNroles2 + 4);
static_assert(kRoleRawSize == kOffRoleRights + 1);

template <class T>
T to_le(T v) noexcept {
    if constexpr (sizeof(T) == 1) return v;
    else if constexpr (sizeof(T) == 2) return zenk_cputole16(v);
    else if constexpr (sizeof(T) == 4) return zenk_cputole32(v);
    else return zenk_cputole64(v);
}

template <class T>
T from_le(T v) noexcept {
    if constexpr (sizeof(T) == 1) return v;
    else if constexpr (sizeof(T) == 2) return zenk_le16tocpu(v);
    else if constexpr (sizeof(T) == 4) return zenk_le32tocpu(v);
    else return zenk_le64tocpu(v);
}

template <class T>
void put(uint8_t *p, T v) noexcept {
    static_assert(std::is_unsigned_v<T>);
    v = to_le(v);
    std::memcpy(p, &v, sizeof v);
}

template <class T>
T get(const uint8_t *p) noexcept {
    static_assert(std::is_unsigned_v<T>);
    T v;
    std::memcpy(&v, p, sizeof v);
    return from_le(v);
}

const uint8_t *bytes_of(const void *p) noexcept { return static_cast<const uint8_t *>(p); }

uint64_t roles_raw_bytes(uint64_t nroles1, uint64_t nroles2) noexcept {
    // Counts are 32-bit, so 13 * (n1 + n2) stays far below 2^64.
    return kRoleRawSize * nroles1 + kRoleRawSize * nroles2;
}

// The 18-byte head common to the mandatory-part and whole-label forms.
void write_ml_head(uint8_t *out, const vyrml_t *ml) noexcept {
    put<uint16_t>(out + kOffVersion, kVersion);
    put<uint16_t>(out + kOffType, ml->type);
    out[kOffLev] = ml->lev;
    out[kOffIlev] = ml->ilev;
    put<uint64_t>(out + kOffCat, ml->cat);
    put<uint32_t>(out + kOffBlobSize, ml->blob_size);
}

void write_blob(uint8_t *out, const vyrml_t *ml) noexcept {
    if (ml->blob_size != 0) std::memcpy(out, ml->blob, ml->blob_size);
}

uint8_t *finish(uint8_t *buf, uint64_t len, uint64_t *size) noexcept {
    if (size != nullptr) *size = len;
    return buf;
}

bool has_version(const uint8_t *b) noexcept { return get<uint16_t>(b + kOffVersion) == kVersion; }

// Builds a mandatory part from the head at `b`, with the blob at
// `b + blob_offset`.  The caller has checked that the whole form is in hand.
vyrml_t *read_ml(const uint8_t *b, size_t blob_offset) noexcept {
    vyrml_t *ml = vyrml_get_new();
    if (ml == nullptr) return nullptr;
    const uint32_t blob_size = get<uint32_t>(b + kOffBlobSize);
    if (blob_size != 0) {
        auto *blob = static_cast<unsigned char *>(std::malloc(blob_size));
        if (blob == nullptr) {
            vyrml_put(ml);
            return nullptr;
        }
        std::memcpy(blob, b + blob_offset, blob_size);
        ml->blob = blob;
        ml->blob_size = blob_size;
    }
    ml->lev = b[kOffLev];
    ml->ilev = b[kOffIlev];
    ml->cat = get<uint64_t>(b + kOffCat);
    ml->type = get<uint16_t>(b + kOffType);
    return ml;
}

// Builds a role part with the given counts, its entries read from `entries`.
// The caller has checked that 13 * (nroles1 + nroles2) bytes are in hand.
vyrrl_t *read_rl(const uint8_t *entries, uint32_t nroles1, uint32_t nroles2) noexcept {
    vyrrl_t *rl = vyrrl_get_new_alloc(nroles1, nroles2);
    if (rl == nullptr) return nullptr;
    const uint8_t *cursor = entries;
    if (nroles1 != 0) vyr_roles_from_raw(rl->roles1, nroles1, &cursor);
    if (nroles2 != 0) vyr_roles_from_raw(rl->roles2, nroles2, &cursor);
    return rl;
}

}  // namespace
}  // namespace vyr::repr

using namespace vyr::repr;

extern "C" {

uint64_t vyrml_raw_size(const vyrml_t *ml) noexcept { return kMlHead + uint64_t{ml->blob_size}; }

uint64_t vyrrl_raw_size(const vyrrl_t *rl) noexcept {
    return kRlHead + roles_raw_bytes(rl->nroles1, rl->nroles2);
}

uint64_t vyrl_raw_size(const vyrl_t *l) noexcept {
    return kLblHead + uint64_t{l->ml->blob_size} + roles_raw_bytes(l->rl->nroles1, l->rl->nroles2);
}

uint64_t vyrrawml_size(const void *bytes) noexcept {
    return kMlHead + uint64_t{get<uint32_t>(bytes_of(bytes) + kOffBlobSize)};
}

uint64_t vyrrawrl_size(const void *bytes) noexcept {
    const uint8_t *b = bytes_of(bytes);
    return kRlHead + roles_raw_bytes(get<uint32_t>(b + kOffRlNroles1), get<uint32_t>(b + kOffRlNroles2));
}

uint64_t vyrrawl_size(const void *bytes) noexcept {
    const uint8_t *b = bytes_of(bytes);
    return kLblHead + uint64_t{get<uint32_t>(b + kOffBlobSize)} +
           roles_raw_bytes(get<uint32_t>(b + kOffLblNroles1), get<uint32_t>(b + kOffLblNroles2));
}

void vyr_roles_to_raw(uint8_t **cursor, const vyr_role_t *roles, uint64_t n) noexcept {
    uint8_t *p = *cursor;
    for (uint64_t i = 0; i < n; ++i, p += kRoleRawSize) {
        put<uint64_t>(p + kOffRoleId, roles[i].id);
        put<uint32_t>(p + kOffRoleAttr, roles[i].attr);
        p[kOffRoleRights] = roles[i].rights;
    }
    *cursor = p;
}

void vyr_roles_from_raw(vyr_role_t *roles, uint64_t n, const uint8_t **cursor) noexcept {
    const uint8_t *p = *cursor;
    for (uint64_t i = 0; i < n; ++i, p += kRoleRawSize) {
        roles[i].id = get<uint64_t>(p + kOffRoleId);
        roles[i].attr = get<uint32_t>(p + kOffRoleAttr);
        roles[i].rights = p[kOffRoleRights];
    }
    *cursor = p;
}

uint8_t *vyrml_get_raw(const vyrml_t *ml, uint64_t *size) noexcept {
    const uint64_t len = vyrml_raw_size(ml);
    auto *buf = static_cast<uint8_t *>(std::malloc(len));
    if (buf == nullptr) return nullptr;
    write_ml_head(buf, ml);
    write_blob(buf + kMlHead, ml);
    return finish(buf, len, size);
}

uint8_t *vyrrl_get_raw(const vyrrl_t *rl, uint64_t *size) noexcept {
    const uint64_t len = vyrrl_raw_size(rl);
    auto *buf = static_cast<uint8_t *>(std::malloc(len));
    if (buf == nullptr) return nullptr;
    put<uint16_t>(buf + kOffVersion, kVersion);
    // The reserved byte carries no meaning; zero keeps the output free of
    // stale heap contents.
    buf[kOffRlReserved] = 0;
    put<uint32_t>(buf + kOffRlNroles1, rl->nroles1);
    uint8_t *cursor = buf + kRlHead;
    vyr_roles_to_raw(&cursor, rl->roles1, rl->nroles1);
    put<uint32_t>(buf + kOffRlNroles2, rl->nroles2);
    vyr_roles_to_raw(&cursor, rl->roles2, rl->nroles2);
    return finish(buf, len, size);
}

uint8_t *vyrl_get_raw(const vyrl_t *l, uint64_t *size) noexcept {
    const vyrml_t *ml = l->ml;
    const vyrrl_t *rl = l->rl;
    const uint64_t len = vyrl_raw_size(l);
    auto *buf = static_cast<uint8_t *>(std::malloc(len));
    if (buf == nullptr) return nullptr;
    write_ml_head(buf, ml);
    write_blob(buf + kLblHead, ml);

    // A list whose count has no array behind it keeps its count, and its
    // entries' room is zeroed rather than left holding stale heap bytes.
    uint8_t *cursor = buf + kLblHead + ml->blob_size;
    auto write_list = [&cursor](const vyr_role_t *roles, uint32_t n) {
        if (n != 0 && roles != nullptr) {
            vyr_roles_to_raw(&cursor, roles, n);
        } else {
            std::memset(cursor, 0, kRoleRawSize * n);
            cursor += kRoleRawSize * n;
        }
    };
    write_list(rl->roles1, rl->nroles1);
    put<uint32_t>(buf + kOffLblNroles1, rl->nroles1);
    write_list(rl->roles2, rl->nroles2);
    put<uint32_t>(buf + kOffLblNroles2, rl->nroles2);
    return finish(buf, len, size);
}

vyrml_t *vyrml_get_from_raw(const void *bytes, uint64_t len, uint64_t *consumed) noexcept {
    const uint8_t *b = bytes_of(bytes);
    if (len < kMlHead || !has_version(b) || len < vyrrawml_size(b)) return nullptr;
    vyrml_t *ml = read_ml(b, kMlHead);
    if (ml == nullptr) return nullptr;
    // The offset of the role entries in a whole-label form with this blob,
    // not the length of this form: callers chain it into
    // vyrrl_get_from_raw_lbl.
    if (consumed != nullptr) *consumed = uint64_t{ml->blob_size} + kLblHead;
    return ml;
}

vyrrl_t *vyrrl_get_from_raw(const void *bytes, uint64_t len) noexcept {
    const uint8_t *b = bytes_of(bytes);
    if (len < kRlHead || !has_version(b) || len < vyrrawrl_size(b)) return nullptr;
    return read_rl(b + kRlHead, get<uint32_t>(b + kOffRlNroles1), get<uint32_t>(b + kOffRlNroles2));
}

vyrrl_t *vyrrl_get_from_raw_lbl(const void *bytes, uint64_t len, uint64_t offset) noexcept {
    const uint8_t *b = bytes_of(bytes);
    if (len < kLblHead) return nullptr;
    const uint32_t nroles1 = get<uint32_t>(b + kOffLblNroles1);
    const uint32_t nroles2 = get<uint32_t>(b + kOffLblNroles2);
    // offset + entries <= len, written so that a huge caller-given offset
    // cannot wrap around.
    if (offset > len || len - offset < roles_raw_bytes(nroles1, nroles2)) return nullptr;
    return read_rl(b + offset, nroles1, nroles2);
}

vyrl_t *vyrl_get_from_raw(const void *bytes, uint64_t len) noexcept {
    const uint8_t *b = bytes_of(bytes);
    auto *l = static_cast<vyrl_t *>(std::malloc(sizeof(vyrl_t)));
    if (l == nullptr) return nullptr;
    if (len < kLblHead || !has_version(b) || len < vyrrawl_size(b)) {
        std::free(l);
        return nullptr;
    }
    vyrml_t *ml = read_ml(b, kLblHead);
    if (ml == nullptr) {
        std::free(l);
        return nullptr;
    }
    vyrrl_t *rl = vyrrl_get_from_raw_lbl(b, len, uint64_t{ml->blob_size} + kLblHead);
    if (rl == nullptr) {
        vyrml_put(ml);
        std::free(l);
        return nullptr;
    }
    l->ml = ml;
    l->rl = rl;
    l->ucnt = 1;
    return l;
}

}  // extern "C"
