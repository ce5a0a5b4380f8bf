// Fuzz target for the three raw label readers.
//
// The input is copied into an exactly sized heap buffer, so a read at or past
// its end is a heap overflow under AddressSanitizer.  A record that comes
// back is written again and must reproduce the bytes it was read from (up to
// the reserved byte of the role-part form, which the writer zeroes).
#include <vyr/label.h>
#include <vyr/raw.h>

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>

namespace {

void check_same(const uint8_t *form, uint64_t len, uint8_t *written, uint64_t size, bool role_part) {
    if (written == nullptr) return;  // out of memory is no finding
    if (size > len) std::abort();
    for (uint64_t i = 0; i < size; ++i) {
        if (role_part && i == 2) continue;
        if (form[i] != written[i]) std::abort();
    }
    std::free(written);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    auto buf = std::make_unique<uint8_t[]>(size);
    if (size != 0) std::memcpy(buf.get(), data, size);
    const uint8_t *b = buf.get();

    uint64_t consumed = 0;
    if (vyrml_t *ml = vyrml_get_from_raw(b, size, &consumed)) {
        if (consumed != uint64_t{ml->blob_size} + 26) std::abort();
        uint64_t n = 0;
        uint8_t *w = vyrml_get_raw(ml, &n);
        check_same(b, size, w, n, false);
        vyrml_put(ml);
    }
    if (vyrrl_t *rl = vyrrl_get_from_raw(b, size)) {
        uint64_t n = 0;
        uint8_t *w = vyrrl_get_raw(rl, &n);
        check_same(b, size, w, n, true);
        vyrrl_put(rl);
    }
    if (vyrl_t *l = vyrl_get_from_raw(b, size)) {
        uint64_t n = 0;
        uint8_t *w = vyrl_get_raw(l, &n);
        check_same(b, size, w, n, false);
        vyrl_put(l);
    }
    // The role reader of a whole-label form, at an offset taken from the input.
    // Inputs of 34 bytes and more carry it in their last 8 bytes; it is
    // taken as it stands half of the time, so huge offsets are tried too.
    uint64_t offset = 26;
    if (size >= 34) {
        std::memcpy(&offset, b + size - 8, sizeof offset);
        if (offset & 1) offset %= size + 1;
    }
    if (vyrrl_t *rl = vyrrl_get_from_raw_lbl(b, size, offset)) vyrrl_put(rl);
    return 0;
}
