// Internal pieces of the classic text form.
#pragma once

#include <cstddef>
#include <cstdint>

namespace vyr::classic {

// The category mask as names from the category database: an entry for the
// whole mask if there is one, else the names of entries that fit inside it,
// comma-separated, with the bits no entry covered in hexadecimal at the end.
// Measures when `buf` is NULL or `size` is 0; otherwise writes, never past
// `size` bytes.  Returns the length measured or stored.
int64_t mac_cat_to_buf(uint64_t cat, char *buf, size_t size) noexcept;

}  // namespace vyr::classic
