// Reader for the name-database configuration file.
//
// The file is plain text, one `key = value` per line. Blank lines and lines
// whose first non-blank character is '#' are ignored. Keys are the field
// names of dbroute_cfg_t; a key given twice keeps its last value. Keys not
// given stay zero/empty. The reader is shared by libdbroute, its tests and
// its fuzz target; it touches no global state.
#pragma once

#include <cstddef>
#include <string_view>

#include "contract/dbroute.h"

namespace vyr::dbroute {

// Where a configuration was refused, for a message a person can act on.
struct ConfError {
    int err = 0;            // errno value describing the failure
    unsigned line = 0;      // 1-based line number, 0 when not tied to a line
    const char* what = "";  // static text, never NULL
};

// Largest configuration file accepted; anything bigger is surely not ours.
inline constexpr std::size_t kMaxConfBytes = 1u << 20;

// Parses `text` into `out`, which is first cleared. Returns true on success.
// On failure returns false, fills `error` and leaves `out` in an unspecified
// state (callers parse into a scratch block and copy it on success).
bool parse_config(std::string_view text, dbroute_cfg_t& out, ConfError& error) noexcept;

// Reads a whole configuration file into a malloc'd buffer (*data, *size).
// Returns 0, or an errno value with nothing allocated.
int read_config_file(const char* path, char** data, std::size_t* size) noexcept;

}  // namespace vyr::dbroute
