// libdbroute: fills the name-database configuration block from a text file.
//
// The file is the one named by VYR_DBROUTE_CONF (ignored in set-id programs,
// hence secure_getenv), else the installed default. A refused file leaves the
// block exactly as it was, so a caller that retries after fixing the file, or
// one that keeps running on the previous configuration, sees no half-updated
// block.
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "contract/dbroute.h"
#include "dbroute_conf.hh"

#ifndef VYR_DBROUTE_CONF_DEFAULT
#error "VYR_DBROUTE_CONF_DEFAULT must name the installed configuration file"
#endif

// Zero-initialised: all databases unconfigured until dbroute_init succeeds.
extern "C" {
dbroute_cfg_t dbroute_cfg;
}

namespace {

const char* config_path() noexcept {
    const char* env = secure_getenv("VYR_DBROUTE_CONF");
    return (env != nullptr && env[0] != '\0') ? env : VYR_DBROUTE_CONF_DEFAULT;
}

// One line on stderr per refusal: a misconfigured system must be easy to
// diagnose, and libvyr only retries start-up when asked again.
int refuse(const char* path, const vyr::dbroute::ConfError& e) noexcept {
    if (e.line != 0)
        std::fprintf(stderr, "dbroute: %s:%u: %s\n", path, e.line, e.what);
    else
        std::fprintf(stderr, "dbroute: %s: %s\n", path, e.what);
    errno = e.err;
    return -1;
}

}  // namespace

extern "C" int dbroute_init(void) noexcept {
    const char* path = config_path();
    char* text = nullptr;
    std::size_t size = 0;
    if (const int err = vyr::dbroute::read_config_file(path, &text, &size); err != 0)
        return refuse(path, {err, 0, std::strerror(err)});

    dbroute_cfg_t scratch;
    vyr::dbroute::ConfError error;
    const bool ok = vyr::dbroute::parse_config({text, size}, scratch, error);
    std::free(text);
    if (!ok) return refuse(path, error);
    std::memcpy(&dbroute_cfg, &scratch, sizeof scratch);
    return 0;
}
