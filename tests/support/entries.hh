// Checks on the entry records of the name databases that let a test state a
// whole result in one line; shared by the database and back-end tests.
//
// take() renders a record the caller got as "name:field:...", decimal, and
// releases it; "null" stands for no record and "<null-name>" for no name.
// Wide names are rendered in the locale's charset.
#pragma once

#include <vyr/namedb.h>

#include <cerrno>
#include <cstdint>
#include <cstdlib>
#include <string>

namespace vyr_test {

// True if a call failed with errno `err`; clears errno for the next check.
inline bool failed_with(bool failed, int err)
{
	const bool ok = failed && errno == err;
	errno = 0;
	return ok;
}

inline std::string name_text(const char *name) { return name ? name : "<null-name>"; }

inline std::string name_text(const wchar_t *name)
{
	if (!name)
		return "<null-name>";
	std::string out(std::wcstombs(nullptr, name, 0) + 1, '\0');
	out.resize(std::wcstombs(out.data(), name, out.size()));
	return out;
}

template <class E>
std::string take(E *e)
{
	if (!e)
		return "null";
	std::string out = name_text(e->name);
	auto add = [&out](uint64_t v) { out += ":" + std::to_string(v); };
	if constexpr (requires { e->lev1; }) {
		add(e->lev1), add(e->cat1), add(e->lev2), add(e->cat2);
	} else {
		add(e->value);
	}
	std::free(e->name);
	std::free(e);
	return out;
}

} // namespace vyr_test
