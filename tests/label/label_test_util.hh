// Helpers shared by the label core tests.
#pragma once

#include "label/label_values.hh"
#include "support/failalloc.h"
#include "support/labels.hh"

#include <vyr/label.h>

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>

namespace label_test {

using label_values::part;
using label_values::role;
using Label = vyr_test::Label;
using Ml = vyr_test::MlRef;
using Rl = vyr_test::RlRef;
struct Free {
	void operator()(void *p) const { std::free(p); }
};
using Roles = std::unique_ptr<vyr_role_t, Free>;

// The use counts of a label and of its two parts.
using Counts = std::tuple<int64_t, int64_t, int64_t>;
inline Counts counts(const vyrl_t *l) { return {vyrl_ucnt(l), vyrml_ucnt(l->ml), vyrrl_ucnt(l->rl)}; }

// A malloc'ed copy, as the library expects of arrays it takes over (never NULL, even empty).
inline vyr_role_t *heap_roles(const std::vector<vyr_role_t> &v)
{
	auto *p = static_cast<vyr_role_t *>(std::malloc(v.size() * sizeof(vyr_role_t) + 1));
	if (p && !v.empty())
		std::memcpy(p, v.data(), v.size() * sizeof(vyr_role_t));
	return p;
}

// (3, 2, 0x55, 1), a 3-byte blob and two entries in each role list: six heap blocks.
inline vyrl_t *rich_label()
{
	const vyr_role_t r1[] = {role(9, 1, 1), role(4, 2, 2)}, r2[] = {role(8, 3, 4), role(2, 4, 8)};
	vyrl_t *l = vyrl_get_new_init_mac_roles(3, 2, 0x55, 1, r1, 2, r2, 2);
	l->ml->blob = static_cast<unsigned char *>(std::malloc(3));
	std::memcpy(l->ml->blob, "\1\2\3", 3);
	l->ml->blob_size = 3;
	return l;
}

// The number of blocks that fn allocates and leaves alive.
template <class F> std::size_t blocks_left_by(F &&fn)
{
	vyr_test::FailAlloc::reset();
	vyr_test::FailAlloc::track(true);
	fn();
	vyr_test::FailAlloc::track(false);
	return vyr_test::FailAlloc::live();
}

// Fails every allocation of make() in turn: a failed call gives null and
// leaves nothing; a complete one is released.  Returns allocations made + 1.
template <class Make, class Release> long sweep_constructor(Make make, Release release)
{
	return vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		auto *p = inj.run(make);
		EXPECT_EQ(p == nullptr, inj.fired()) << "allocation " << inj.n();
		if (p)
			release(p);
	});
}

} // namespace label_test
