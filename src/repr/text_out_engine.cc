// The label format engine and the functions built directly on it.
#include "repr/text_out.hh"

#include <cstdarg>
#include <cstring>

namespace vyr::repr {
namespace {

constexpr int flag_of_letter(char c) noexcept
{
	switch (c) {
	case 'N': return VYR_TEXT_NUMERIC;
	case 'R': return VYR_TEXT_NAMED_ONLY;
	case 'Z': return VYR_TEXT_OMIT_ZERO;
	default: return 0;
	}
}

// Runs one conversion.  An unknown letter is swallowed and writes nothing.
int convert(char letter, int flags, const vyrml_t *ml, const vyrrl_t *rl,
            struct obstack *o) noexcept
{
	switch (letter) {
	case 'l': return vyr_lev_obstack(ml->lev, o, flags);
	case 'i': return vyr_ilev_obstack(ml->ilev, o, flags);
	case 'c': return vyr_cat_obstack(ml->cat, o, flags);
	case 't': return vyr_type_obstack(ml->type, o, flags);
	case 'm': return vyrml_obstack(ml, o, flags);
	case 'r': return vyrrl_obstack(rl, o, flags);
	default: return 0;
	}
}

// Skips the justification and width of a directive; they have no effect.
const char *skip_width(const char *p) noexcept
{
	if (*p == '-')
		++p;
	while (*p == '0')
		++p;
	while (*p >= '0' && *p <= '9')
		++p;
	return p;
}

// Reads the flag letters of a directive into *flags and returns the position
// of its conversion letter.  A second N right behind an N is not a flag: it
// is the conversion letter itself (an unknown one).
const char *read_flags(const char *p, int stored, int *flags) noexcept
{
	char prev = '\0';
	for (;; prev = *p++) {
		if (*p == 'N' && prev == 'N')
			return p;
		if (*p == 'G')
			*flags |= stored;
		else if (int bit = flag_of_letter(*p))
			*flags |= bit;
		else
			return p;
	}
}

char *asprintf_parts(const vyrml_t *ml, const vyrrl_t *rl, const char *fmt,
                     std::va_list ap) noexcept
{
	return build_text([&](struct obstack *o) {
		return vyr_obstack_vprintf(ml, rl, o, fmt, ap);
	});
}

} // namespace

// Invariant: `count` is the number of bytes this call has appended so far,
// and `stored` the flag word of the latest F (0 before any), which lives for
// this call only.
int vyr_obstack_vprintf(const vyrml_t *ml, const vyrrl_t *rl, struct obstack *o,
                        const char *fmt, std::va_list ap) noexcept
{
	int count = 0;
	int stored = 0;
	const char *p = fmt;
	for (;;) {
		// Copy the literal run up to the next directive in one go.
		const char *run = p;
		while (*p != '\0' && *p != '%')
			++p;
		if (p != run) {
			obstack_grow(o, run, p - run);
			count += static_cast<int>(p - run);
		}
		if (*p == '\0')
			return count;
		++p; // past '%'
		if (*p == '\0')
			return count;
		if (*p == '%') {
			obstack_1grow(o, '%');
			++count;
			++p;
			continue;
		}
		p = skip_width(p);
		if (*p == 'F') {
			stored = va_arg(ap, int);
			++p;
			continue;
		}
		int flags = 0;
		p = read_flags(p, stored, &flags);
		if (*p == '\0')
			return count; // format ended inside the directive
		int n = convert(*p++, flags, ml, rl, o);
		if (n < 0)
			return -1;
		count += n;
	}
}

} // namespace vyr::repr

using vyr::repr::asprintf_parts;
using vyr::repr::vyr_obstack_vprintf;

extern "C" {

int vyrml_obstack_printf(const vyrml_t *ml, struct obstack *o, const char *fmt, ...) noexcept
{
	va_list ap;
	va_start(ap, fmt);
	int n = vyr_obstack_vprintf(ml, nullptr, o, fmt, ap);
	va_end(ap);
	return n;
}

int vyrrl_obstack_printf(const vyrrl_t *rl, struct obstack *o, const char *fmt, ...) noexcept
{
	va_list ap;
	va_start(ap, fmt);
	int n = vyr_obstack_vprintf(nullptr, rl, o, fmt, ap);
	va_end(ap);
	return n;
}

int vyrl_obstack_printf(const vyrl_t *l, struct obstack *o, const char *fmt, ...) noexcept
{
	va_list ap;
	va_start(ap, fmt);
	int n = vyr_obstack_vprintf(l->ml, l->rl, o, fmt, ap);
	va_end(ap);
	return n;
}

char *vyrml_asprintf(const vyrml_t *ml, const char *fmt, ...) noexcept
{
	va_list ap;
	va_start(ap, fmt);
	char *s = asprintf_parts(ml, nullptr, fmt, ap);
	va_end(ap);
	return s;
}

char *vyrrl_asprintf(const vyrrl_t *rl, const char *fmt, ...) noexcept
{
	va_list ap;
	va_start(ap, fmt);
	char *s = asprintf_parts(nullptr, rl, fmt, ap);
	va_end(ap);
	return s;
}

char *vyrl_asprintf(const vyrl_t *l, const char *fmt, ...) noexcept
{
	va_list ap;
	va_start(ap, fmt);
	char *s = asprintf_parts(l->ml, l->rl, fmt, ap);
	va_end(ap);
	return s;
}

int vyrml_obstack(const vyrml_t *ml, struct obstack *o, int flags) noexcept
{
	return vyrml_obstack_printf(ml, o, "%F%Gl:%Gi:%Gc:%Gt", flags);
}

int vyrl_obstack(const vyrl_t *l, struct obstack *o, int flags) noexcept
{
	return vyrl_obstack_printf(l, o, "%F%Gm!%Gr", flags);
}

char *vyrml_get_text(const vyrml_t *ml, int flags) noexcept
{
	return vyr::repr::build_text([&](struct obstack *o) { return vyrml_obstack(ml, o, flags); });
}

char *vyrl_get_text(const vyrl_t *l, int flags) noexcept
{
	return vyr::repr::build_text([&](struct obstack *o) { return vyrl_obstack(l, o, flags); });
}

// The object is never NUL-terminated inside the obstack; the copy adds the
// terminator.  The obstack is released whether or not the copy succeeds.
// The object is copied from its base rather than through obstack_finish:
// the whole obstack goes away here, so closing the object changes nothing,
// and glibc's obstack_finish aligns by adding an offset to a null pointer,
// which is undefined behaviour (UBSan reports it on every call).
char *vyr_obstack_finish(struct obstack *o) noexcept
{
	const size_t len = obstack_object_size(o);
	const char *text = static_cast<const char *>(obstack_base(o));
	char *copy = vyr::repr::copy_text(text, len);
	obstack_free(o, nullptr);
	return copy;
}

} // extern "C"
