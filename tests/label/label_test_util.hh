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

// Owning pointers: one reference to a record, or a malloc'ed role array.
using Label = vyr_test::Label;
using Ml = vyr_test::MlRef;
using Rl = vyr_test::RlRef;

struct Free {
	void operator()(void *p) const { std::free(p); }
};
using Roles = std::unique_ptr<vyr_role_t, Free>;

// The use counts of a label and of its two parts.
using Counts = std::tuple<int64_t, int64_t, int64_t>;
inline Counts counts(const vyrl_t *l)
{
	return {vyrl_ucnt(l), vyrml_ucnt(l->ml), vyrrl_ucnt(l->rl)};
}

// A malloc'ed copy of the entries, as the library expects of arrays that it
// takes over or releases (never NULL for an empty list).
inline vyr_role_t *heap_roles(const std::vector<vyr_role_t> &v)
{
	auto *p = static_cast<vyr_role_t *>(std::malloc(v.size() * sizeof(vyr_role_t) + 1));
	if (p && !v.empty())
		std::memcpy(p, v.data(), v.size() * sizeof(vyr_role_t));
	return p;
}

inline unsigned char *heap_blob(const std::vector<unsigned char> &bytes)
{
	auto *p = static_cast<unsigned char *>(std::malloc(bytes.size()));
	std::memcpy(p, bytes.data(), bytes.size());
	return p;
}

// A label with every member in use: (3, 2, 0x55, 1), a 3-byte blob and two
// entries in each role list.  Six heap blocks.
inline vyrl_t *rich_label()
{
	const vyr_role_t r1[] = {role(9, 1, 1), role(4, 2, 2)};
	const vyr_role_t r2[] = {role(8, 3, 4), role(2, 4, 8)};
	vyrl_t *l = vyrl_get_new_init_mac_roles(3, 2, 0x55, 1, r1, 2, r2, 2);
	l->ml->blob = heap_blob({1, 2, 3});
	l->ml->blob_size = 3;
	return l;
}

// The number of blocks that fn allocates and leaves alive.
template <class F>
std::size_t blocks_left_by(F &&fn)
{
	vyr_test::FailAlloc::reset();
	vyr_test::FailAlloc::track(true);
	fn();
	vyr_test::FailAlloc::track(false);
	return vyr_test::FailAlloc::live();
}

// Sweeps every allocation of make() through failure: a failed call returns
// null and leaves nothing behind, a complete one is released with release().
// Returns the number of attempts: one more than the allocations made.
template <class Make, class Release>
long sweep_constructor(Make make, Release release)
{
	return vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		auto *p = inj.run(make);
		if (inj.fired())
			EXPECT_EQ(p, nullptr) << "allocation " << inj.n() << " failed";
		else
			EXPECT_NE(p, nullptr);
		if (p)
			release(p);
	});
}

} // namespace label_test
