// Owning pointers to label records: each holds one reference to a whole
// label or to one of its parts, and drops it when it goes.
#pragma once

#include <vyr/label.h>

#include <memory>

namespace vyr_test {

struct LabelPut {
	void operator()(vyrl_t *l) const noexcept { vyrl_put(l); }
	void operator()(vyrml_t *m) const noexcept { vyrml_put(m); }
	void operator()(vyrrl_t *r) const noexcept { vyrrl_put(r); }
};

using Label = std::unique_ptr<vyrl_t, LabelPut>;
using MlRef = std::unique_ptr<vyrml_t, LabelPut>;
using RlRef = std::unique_ptr<vyrrl_t, LabelPut>;

} // namespace vyr_test
