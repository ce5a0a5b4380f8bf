// Value builders shared by the label core tests and benchmarks, with every
// byte (padding included) defined, so that byte-wise comparisons and copies
// see no stray values.  Free of any test framework.
#pragma once

#include <vyr/label.h>

#include <cstdint>
#include <cstring>

namespace label_values {

inline vyr_role_t role(uint64_t id, uint32_t attr = 0, uint8_t rights = 0)
{
	vyr_role_t r;
	std::memset(&r, 0, sizeof r);
	r.id = id, r.attr = attr, r.rights = rights;
	return r;
}

// A mandatory part with no blob and use count 1, not from the heap (never vyrml_put).
inline vyrml_t part(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type = 0)
{
	vyrml_t m;
	std::memset(&m, 0, sizeof m);
	m.lev = lev, m.ilev = ilev, m.cat = cat, m.type = type, m.ucnt = 1;
	return m;
}

} // namespace label_values
