// Fuzz target: the name-database configuration reader.
// Whatever the input, the reader either refuses it with an errno value and a
// message, or produces a block whose text fields are terminated and whose
// back-end names cannot reach outside the plug-in directory.
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>

#include "dbroute_conf.hh"

namespace {

void check_text(const char* field, std::size_t size, bool backend) {
    const void* nul = std::memchr(field, '\0', size);
    if (nul == nullptr) __builtin_trap();
    if (backend && std::strchr(field, '/') != nullptr) __builtin_trap();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    dbroute_cfg_t cfg;
    vyr::dbroute::ConfError error;
    const std::string_view text(reinterpret_cast<const char*>(data), size);
    if (!vyr::dbroute::parse_config(text, cfg, error)) {
        if (error.err == 0 || error.what == nullptr || error.what[0] == '\0') __builtin_trap();
        return 0;
    }
    check_text(cfg.mac_backend, sizeof cfg.mac_backend, true);
    check_text(cfg.lev_backend, sizeof cfg.lev_backend, true);
    check_text(cfg.cat_backend, sizeof cfg.cat_backend, true);
    check_text(cfg.mac_charset, sizeof cfg.mac_charset, false);
    check_text(cfg.lev_charset, sizeof cfg.lev_charset, false);
    check_text(cfg.cat_charset, sizeof cfg.cat_charset, false);
    check_text(cfg.files_dir, sizeof cfg.files_dir, false);
    if (cfg.files_dir[0] != '\0' && cfg.files_dir[0] != '/') __builtin_trap();
    return 0;
}
