// Vocabulary of the label text form, shared by the writers and the readers.
//
// The tables are searched in the order given here; that order is part of the
// text form (a composite name wins over the bit names, and bit names are
// written lowest bit first).
#pragma once

#include <clocale>
#include <cstdint>
#include <libintl.h>

namespace vyr::repr {

struct TypeName {
	std::uint16_t value;
	const char *name;
};

// Type words that have a name of their own.
inline constexpr TypeName type_composites[] = {
	{3, "CCNRA"},
	{7, "ALL"},
};

// Single type bits and their names.
inline constexpr TypeName type_bits[] = {
	{1, "ccnr"},
	{2, "ccnri"},
	{4, "ehole"},
};

// Message ids of the fixed words.  ":No" is a message of its own so that a
// translation may change the separator too.
inline constexpr char word_low[] = "Low";
inline constexpr char word_high[] = "High";
inline constexpr char word_no[] = "No";
inline constexpr char word_colon_no[] = ":No";

inline constexpr char text_domain[] = "vyr";

// A fixed word in the caller's language.  Looked up at every use: the
// application may bind or switch the domain at any time, so nothing is cached.
inline const char *translated(const char *msgid) noexcept
{
	return ::dcgettext(text_domain, msgid, LC_MESSAGES);
}

} // namespace vyr::repr
