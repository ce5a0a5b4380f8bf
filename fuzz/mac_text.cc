// Fuzz target for the classic value's two readers: the text reader and the
// flat 24-byte form.
//
// Text: a value that the reader accepts is valid, prints back in numbers and
// reads back the same; a value it refuses is left exactly as it was.
// Flat form: the 24 bytes are copied into an exactly sized heap buffer, and
// what comes back writes the same words again.
#include <vyr/classic.h>

#include "contract/tavrel_aux.h"

#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>

namespace {

struct MacFree {
    void operator()(mac_t *m) const { mac_free(m); }
};
using Mac = std::unique_ptr<mac_t, MacFree>;

constexpr int kAllNumeric = MAC_TEXT_LEV | MAC_TEXT_CAT | MAC_TEXT_TYPE;

void check_text(const std::string &text) {
    Mac m{mac_init(MAC_TYPE_EQU_W)};
    if (!m) return;
    m->lev = 0x5a;
    m->cat = 0x1234;
    const mac_t before = *m;
    if (mac_from_text(m.get(), text.c_str()) != 0) {
        if (std::memcmp(&before, m.get(), sizeof before) != 0) std::abort();
        return;
    }
    if (mac_valid(m.get()) != 0) std::abort();
    if (m->type_low != (m->type & 0xff)) std::abort();

    char *again = mac_to_text(m.get(), nullptr, kAllNumeric);
    if (!again) return;  // out of memory is no finding
    Mac back{mac_init(0)};
    errno = 0;
    int rc = back ? mac_from_text(back.get(), again) : -1;
    if (rc == 0) {
        if (back->lev != m->lev || back->cat != m->cat || back->type != (m->type | MAC_CLASS_OBJECT)) std::abort();
    } else if (errno == EINVAL) {
        std::abort();  // the reader refused what the writer wrote
    }
    std::free(again);
}

void check_flat(const uint8_t *data) {
    auto buf = std::make_unique<uint8_t[]>(MAC_EXT_SIZE);
    std::memcpy(buf.get(), data, MAC_EXT_SIZE);
    Mac m{mac_copy_int(buf.get())};
    if (!m) {
        if (zenk_get_w16(buf.get()) == 0x100) std::abort();  // only a bad magic word fails
        return;
    }
    uint8_t out[MAC_EXT_SIZE];
    std::memcpy(out, buf.get(), sizeof out);
    if (mac_copy_ext(out, m.get(), sizeof out) != MAC_EXT_SIZE) std::abort();
    if (std::memcmp(out, buf.get(), sizeof out) != 0) std::abort();
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    // No name databases: the readers fall back to numbers, and nothing is
    // read from the system's configuration.
    setenv("VYR_DBROUTE_CONF", "/dev/null", 1);
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    if (size >= MAC_EXT_SIZE) check_flat(data);
    check_text(std::string(reinterpret_cast<const char *>(data), size).c_str());
    return 0;
}
