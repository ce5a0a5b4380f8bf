// Property checks shared by the text fuzz targets.  A failed check traps, so
// the fuzzer stops on the input and keeps it.
#pragma once

#include <vyr/types.h>

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>
#include <vector>

namespace vyr_fuzz {

inline void require(bool ok)
{
	if (!ok)
		__builtin_trap();
}

// A NUL-terminated, writable copy of a fuzz input: the readers take C
// strings, so the text ends at the first NUL.
struct Text {
	std::vector<char> bytes;

	explicit Text(std::string_view s) : bytes(s.begin(), s.end()) { bytes.push_back('\0'); }
	char *data() { return bytes.data(); }
	size_t len() const { return std::strlen(bytes.data()); }
};

// An in-place reader may only have cut the text at the given separators.
inline void require_cut_only(const Text &original, const Text &worked, const char *separators)
{
	for (size_t i = 0; i < original.len(); ++i) {
		if (worked.bytes[i] == original.bytes[i])
			continue;
		require(worked.bytes[i] == '\0' && std::strchr(separators, original.bytes[i]) != nullptr);
	}
}

// A role list as the readers hand it out: descending ids without
// duplicates, attr and rights cleared, and a buffer exactly when not empty.
inline void require_normalised(const vyr_role_t *roles, uint32_t n)
{
	require((roles == nullptr) == (n == 0));
	for (uint32_t i = 0; i < n; ++i) {
		require(roles[i].attr == 0 && roles[i].rights == 0);
		if (i > 0)
			require(roles[i - 1].id > roles[i].id);
	}
}

} // namespace vyr_fuzz
