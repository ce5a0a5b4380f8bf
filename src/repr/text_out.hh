// Internal pieces of the label text writers.
#pragma once

#include <vyr/text.h>
#include <vyr/types.h>

#include <cstdarg>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <obstack.h>

namespace vyr::repr {

// The format engine behind every *_obstack_printf and *_asprintf.  Neither
// part pointer is tested: a format may only use the conversions whose part
// it was given.  Returns the bytes appended, or -1 at the first failed write.
int vyr_obstack_vprintf(const vyrml_t *ml, const vyrrl_t *rl, struct obstack *o,
                        const char *fmt, std::va_list ap) noexcept;

// Builds a string on an obstack of its own: write(o) appends the text and
// returns a count or -1.  On -1 everything is thrown away and the result is
// NULL; otherwise the text is returned as a new malloc'd string.
//
// Running out of memory inside the obstack itself (its first chunk, or a
// chunk to grow into) is left to <obstack.h>: obstack_alloc_failed_handler is
// the application's policy for that, and it does not return here.
// strndup: a malloc'd copy of at most max bytes of s, NUL-terminated; NULL
// when the allocation fails.  Spelled out with malloc so that every string
// handed out comes from the one allocator the process may have replaced
// (sanitizer runtimes serve strdup from their own).
inline char *copy_text(const char *s, size_t max = SIZE_MAX) noexcept
{
	const size_t len = strnlen(s, max);
	auto *copy = static_cast<char *>(malloc(len + 1));
	if (copy == nullptr)
		return nullptr;
	std::memcpy(copy, s, len);
	copy[len] = '\0';
	return copy;
}

// Chunk allocator of the library's own obstacks: malloc, in the parameter
// type that <obstack.h> declares.
inline void *chunk_malloc(long size) noexcept
{
	return malloc(static_cast<size_t>(size));
}

template <class Write>
char *build_text(Write &&write) noexcept
{
	struct obstack o;
	_obstack_begin(&o, 0, 0, chunk_malloc, free);
	if (write(&o) < 0) {
		obstack_free(&o, nullptr);
		return nullptr;
	}
	return vyr_obstack_finish(&o);
}

} // namespace vyr::repr
