// The stored form of a label and its exchange with the in-memory records.
//
// Labels are stored in the whole-label raw form: a packed little-endian head
// of 26 bytes, then the blob, then the entries of both role lists at 13 bytes
// each (id 8, attr 4, rights 1).
//
//   off size field          off size field
//    0   2   version (1)     14   4   blob_size
//    2   2   type            18   4   nroles1
//    4   1   lev             22   4   nroles2
//    5   1   ilev            26   .   blob, then roles1, then roles2
//    6   8   cat
//
// The service keeps one invariant on what it stores: each role list is in
// strictly descending order of id.  Set commands refuse other lists, and the
// decoder treats a stored list out of order as corrupt, so every label that
// a get command hands out has canonical lists.
#pragma once

#include <cstddef>
#include <cstdint>

#include <vyr/types.h>

namespace tavrel {

inline constexpr size_t kHeadSize = 26;
inline constexpr size_t kRoleSize = 13;
inline constexpr uint16_t kFormVersion = 1;
// Largest stored form accepted, in line with the largest extended attribute
// value that Linux keeps.
inline constexpr size_t kMaxFormSize = 65536;

// A decoded stored label: the head's values and pointers into the stored
// bytes for the variable parts.  Valid while those bytes are.
struct StoredLabel {
	uint8_t lev = 0;
	uint8_t ilev = 0;
	uint64_t cat = 0;
	uint16_t type = 0;
	uint32_t blob_size = 0;
	uint32_t nroles1 = 0;
	uint32_t nroles2 = 0;
	const uint8_t *blob = nullptr;
	const uint8_t *roles1 = nullptr;  // nroles1 entries of kRoleSize bytes
	const uint8_t *roles2 = nullptr;  // nroles2 entries of kRoleSize bytes
};

// Checks and decodes `len` bytes of a stored form.  Returns 0, or:
//   EINVAL  the version word is not 1;
//   EIO     the bytes are shorter or longer than the sizes in the head
//           announce, or a role list is not in strictly descending order.
// Reads no byte at or past len, and writes `out` only on success.
int decode_label(const uint8_t *data, size_t len, StoredLabel *out) noexcept;

// Checks that a label handed to a set command can be stored.  Returns 0, or:
//   EFAULT  a missing record, or a count above 0 with a NULL buffer;
//   EINVAL  a role list not in strictly descending order of id;
//   ENOSPC  the stored form would exceed kMaxFormSize.
int check_label(const vyrl_t *label) noexcept;

// Bytes of the stored form of a label that check_label accepted.
size_t encoded_size(const vyrl_t *label) noexcept;

// Writes the stored form of a label that check_label accepted into `out`,
// which holds encoded_size(label) bytes.
void encode_label(const vyrl_t *label, uint8_t *out) noexcept;

// Fills a label in place from a stored one, as a get command does.  The room
// offered is the label's blob_size, nroles1 and nroles2.  Returns 0 when
// everything was filled, or:
//   E2BIG   the stored label needs more room than offered in at least one
//           of the three; the three sizes needed were written and nothing
//           else was touched;
//   EFAULT  a missing record, or room needed in a NULL buffer; nothing
//           was touched.
int fill_label(const StoredLabel &stored, vyrl_t *label) noexcept;

// The all-zero label, as read from a target that has none stored.
inline constexpr StoredLabel kZeroLabel{};

} // namespace tavrel
