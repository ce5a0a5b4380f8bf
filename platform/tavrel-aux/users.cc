// User records from the system's user database.
//
// The record is one heap block: a struct passwd followed by the scratch area
// that getpw*_r fills with the strings, so its pointers point into the same
// block and a single free releases everything.
#include "contract/tavrel_aux.h"

#include <cerrno>
#include <cstdlib>
#include <unistd.h>

namespace {

// First scratch size when the system gives no hint; doubled on ERANGE.
constexpr size_t kDefaultScratch = 1024;
// Upper bound on the scratch area, so a misbehaving source cannot make us
// grow forever.
constexpr size_t kMaxScratch = size_t{1} << 20;

size_t initial_scratch() noexcept
{
	const long hint = sysconf(_SC_GETPW_R_SIZE_MAX);
	return hint > 0 ? static_cast<size_t>(hint) : kDefaultScratch;
}

// Runs `lookup(pw, scratch, size, &result)` (a getpw*_r call) on a growing
// block until it fits.
template <class Lookup>
struct passwd *fetch_user(Lookup &&lookup) noexcept
{
	for (size_t scratch = initial_scratch(); scratch <= kMaxScratch; scratch *= 2) {
		auto *block = static_cast<char *>(std::malloc(sizeof(struct passwd) + scratch));
		if (!block)
			return nullptr;
		auto *pw = reinterpret_cast<struct passwd *>(block);
		struct passwd *result = nullptr;
		const int rc = lookup(pw, block + sizeof(struct passwd), scratch, &result);
		if (rc == 0 && result)
			return pw;
		std::free(block);
		if (rc == ERANGE)
			continue;
		errno = rc != 0 ? rc : ENOENT;
		return nullptr;
	}
	errno = ERANGE;
	return nullptr;
}

} // namespace

extern "C" {

struct passwd *zenk_getpwnam(const char *name) noexcept
{
	if (!name) {
		errno = EINVAL;
		return nullptr;
	}
	return fetch_user([name](struct passwd *pw, char *buf, size_t len, struct passwd **res) {
		return getpwnam_r(name, pw, buf, len, res);
	});
}

struct passwd *zenk_getpwuid(uint32_t uid) noexcept
{
	return fetch_user([uid](struct passwd *pw, char *buf, size_t len, struct passwd **res) {
		return getpwuid_r(static_cast<uid_t>(uid), pw, buf, len, res);
	});
}

} // extern "C"
