// Helpers for the boundary between the library's C++ inside and its C
// interface.
#pragma once

#include <cerrno>
#include <cstdlib>
#include <memory>
#include <new>

namespace vyr {

// Owns a block from malloc/calloc until it is handed to the caller.
struct FreeDeleter {
	void operator()(void *p) const noexcept { std::free(p); }
};
template <class T>
using malloc_ptr = std::unique_ptr<T, FreeDeleter>;

// Runs fn and turns any exception into the C failure value `fail`; no
// exception may cross the exported interface. Allocation failure reads as
// ENOMEM, as it would from malloc.
template <class R, class F>
R c_call(R fail, F &&fn) noexcept
{
	try {
		return fn();
	} catch (const std::bad_alloc &) {
		errno = ENOMEM;
	} catch (...) {
		errno = EINVAL;
	}
	return fail;
}

} // namespace vyr
