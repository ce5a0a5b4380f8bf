// Helpers shared by the label core tests.
#pragma once

#include <vyr/label.h>

#include "support/failalloc.h"

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <vector>

#include <gtest/gtest.h>

namespace label_test {

struct Put {
	void operator()(vyrl_t *l) const { vyrl_put(l); }
	void operator()(vyrml_t *m) const { vyrml_put(m); }
	void operator()(vyrrl_t *r) const { vyrrl_put(r); }
};
using Label = std::unique_ptr<vyrl_t, Put>;
using Ml = std::unique_ptr<vyrml_t, Put>;
using Rl = std::unique_ptr<vyrrl_t, Put>;

struct Free {
	void operator()(void *p) const { std::free(p); }
};
using Roles = std::unique_ptr<vyr_role_t, Free>;

inline vyr_role_t role(uint64_t id, uint32_t attr = 0, uint8_t rights = 0)
{
	vyr_role_t r;
	std::memset(&r, 0, sizeof r);
	r.id = id;
	r.attr = attr;
	r.rights = rights;
	return r;
}

// A malloc'ed copy of the entries, as the library expects for arrays it
// takes over or releases.
inline vyr_role_t *heap_roles(const std::vector<vyr_role_t> &v)
{
	auto *p = static_cast<vyr_role_t *>(std::malloc(v.size() * sizeof(vyr_role_t) + 1));
	if (p && !v.empty())
		std::memcpy(p, v.data(), v.size() * sizeof(vyr_role_t));
	return p;
}

inline std::vector<uint64_t> ids_of(const vyr_role_t *r, uint32_t n)
{
	std::vector<uint64_t> out;
	for (uint32_t k = 0; k < n; ++k)
		out.push_back(r[k].id);
	return out;
}

// A blob of the given bytes from malloc.
inline unsigned char *heap_blob(const std::vector<unsigned char> &bytes)
{
	auto *p = static_cast<unsigned char *>(std::malloc(bytes.size()));
	std::memcpy(p, bytes.data(), bytes.size());
	return p;
}

// A full label: blob of 3 bytes, two entries in each role list.
inline vyrl_t *rich_label()
{
	const vyr_role_t r1[] = {role(9, 1, 1), role(4, 2, 2)};
	const vyr_role_t r2[] = {role(8, 3, 4), role(2, 4, 8)};
	vyrl_t *l = vyrl_get_new_init_mac_roles(3, 2, 0x55, 1, r1, 2, r2, 2);
	l->ml->blob = heap_blob({1, 2, 3});
	l->ml->blob_size = 3;
	return l;
}

// Counts the blocks that fn allocates and leaves alive.
template <class F>
std::size_t blocks_left_by(F &&fn)
{
	vyr_test::FailAlloc::reset();
	vyr_test::FailAlloc::track(true);
	fn();
	vyr_test::FailAlloc::track(false);
	std::size_t n = vyr_test::FailAlloc::live();
	return n;
}

// Sweeps every allocation of make() through failure: a failed call must
// return null and leave nothing behind; a complete one is released with
// release().  Returns the number of attempts, one more than the number of
// allocations the call makes.
template <class Make, class Release>
long sweep_constructor(Make make, Release release)
{
	return vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		auto *p = inj.run(make);
		if (inj.fired()) {
			EXPECT_EQ(p, nullptr) << "allocation " << inj.n() << " failed";
			if (p)
				release(p);
			return;
		}
		ASSERT_NE(p, nullptr);
		release(p);
	});
}

} // namespace label_test
