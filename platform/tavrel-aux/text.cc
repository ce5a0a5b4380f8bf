// Charset conversion, number to text, bounded formatting and wide strings.
#include "contract/tavrel_aux.h"

#include <cerrno>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <cwchar>

namespace {

// Terminator appended to converted text: four zero bytes, so that the result
// ends with a NUL character also in target charsets whose units are wider
// than one byte.
constexpr size_t kTerminator = 4;

// Frees a malloc'd block unless released; keeps every early return clean.
struct HeapBlock {
	char *p = nullptr;
	HeapBlock() = default;
	HeapBlock(const HeapBlock &) = delete;
	HeapBlock &operator=(const HeapBlock &) = delete;
	~HeapBlock() { std::free(p); }
	char *release() noexcept
	{
		char *r = p;
		p = nullptr;
		return r;
	}
};

// Grows `buf` to `want` bytes, keeping its contents; false (ENOMEM) leaves it as it was.
bool grow(HeapBlock &buf, size_t want) noexcept
{
	char *n = static_cast<char *>(std::realloc(buf.p, want));
	if (!n)
		return false;
	buf.p = n;
	return true;
}

} // namespace

extern "C" {

char *zenk_encode(iconv_t cd, const char *in) noexcept
{
	if (cd == reinterpret_cast<iconv_t>(-1)) {
		errno = EBADF;
		return nullptr;
	}
	if (!in) {
		errno = EINVAL;
		return nullptr;
	}
	// Start from the initial shift state whatever the descriptor saw before.
	iconv(cd, nullptr, nullptr, nullptr, nullptr);

	size_t in_left = std::strlen(in);
	char *in_ptr = const_cast<char *>(in);  // iconv's signature; never written
	size_t cap = in_left * 2 + 16;
	HeapBlock out;
	if (!grow(out, cap))
		return nullptr;
	size_t used = 0;
	bool flushing = false;  // after the input, one call emits the final shift
	for (;;) {
		char *out_ptr = out.p + used;
		size_t out_left = cap - used - kTerminator;
		size_t rc = flushing ? iconv(cd, nullptr, nullptr, &out_ptr, &out_left)
		                     : iconv(cd, &in_ptr, &in_left, &out_ptr, &out_left);
		used = static_cast<size_t>(out_ptr - out.p);
		if (rc != static_cast<size_t>(-1)) {
			if (flushing)
				break;
			flushing = true;
			continue;
		}
		if (errno != E2BIG)
			return nullptr;  // EILSEQ, EINVAL (truncated sequence): errno stays
		cap *= 2;
		if (!grow(out, cap))
			return nullptr;
	}
	std::memset(out.p + used, 0, kTerminator);
	return out.release();
}

char *zenk_u64tostr(char *buf, uint64_t value, unsigned int base) noexcept
{
	if (base < 2 || base > 36) {
		errno = EINVAL;
		return nullptr;
	}
	// Digits are produced backwards into a scratch area and copied once, so
	// that a value that does not fit leaves the caller's buffer untouched.
	char digits[64];
	size_t n = 0;
	do {
		digits[n++] = "0123456789abcdefghijklmnopqrstuvwxyz"[value % base];
		value /= base;
	} while (value != 0);
	if (n + 1 > ZENK_U64TOSTR_BUFSIZE) {
		errno = EINVAL;
		return nullptr;
	}
	for (size_t i = 0; i < n; ++i)
		buf[i] = digits[n - 1 - i];
	buf[n] = '\0';
	return buf;
}

int zenk_scnprintf(char *buf, size_t size, const char *fmt, ...) noexcept
{
	if (size == 0)
		return 0;
	va_list ap;
	va_start(ap, fmt);
	const int needed = std::vsnprintf(buf, size, fmt, ap);
	va_end(ap);
	if (needed < 0) {
		buf[0] = '\0';
		return 0;
	}
	if (static_cast<size_t>(needed) >= size)
		return static_cast<int>(size - 1);
	return needed;
}

wchar_t *zenk_string_towc(const char *s) noexcept
{
	if (!s) {
		errno = EINVAL;
		return nullptr;
	}
	std::mbstate_t st{};
	const char *src = s;
	const size_t n = std::mbsrtowcs(nullptr, &src, 0, &st);
	if (n == static_cast<size_t>(-1))
		return nullptr;  // EILSEQ from the conversion
	auto *out = static_cast<wchar_t *>(std::malloc((n + 1) * sizeof(wchar_t)));
	if (!out)
		return nullptr;
	st = std::mbstate_t{};
	src = s;
	std::mbsrtowcs(out, &src, n + 1, &st);
	return out;
}

char *zenk_string_fromwc(const wchar_t *ws) noexcept
{
	if (!ws) {
		errno = EINVAL;
		return nullptr;
	}
	std::mbstate_t st{};
	const wchar_t *src = ws;
	const size_t n = std::wcsrtombs(nullptr, &src, 0, &st);
	if (n == static_cast<size_t>(-1))
		return nullptr;  // EILSEQ: a character the locale cannot encode
	auto *out = static_cast<char *>(std::malloc(n + 1));
	if (!out)
		return nullptr;
	st = std::mbstate_t{};
	src = ws;
	std::wcsrtombs(out, &src, n + 1, &st);
	return out;
}

} // extern "C"
