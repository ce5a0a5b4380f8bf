// Owning pointers to label records: each holds one reference to a whole
// label or to one of its parts, and drops it when it goes.
#pragma once

#include <vyr/label.h>
#include <vyr/raw.h>

#include <cstdlib>
#include <memory>
#include <string>

namespace vyr_test {

struct LabelPut {
	void operator()(vyrl_t *l) const noexcept { vyrl_put(l); }
	void operator()(vyrml_t *m) const noexcept { vyrml_put(m); }
	void operator()(vyrrl_t *r) const noexcept { vyrrl_put(r); }
};

using Label = std::unique_ptr<vyrl_t, LabelPut>;
using MlRef = std::unique_ptr<vyrml_t, LabelPut>;
using RlRef = std::unique_ptr<vyrrl_t, LabelPut>;

// The whole-label byte form of l, or "" when it cannot be written: two
// labels are the same label exactly when these bytes are.
inline std::string raw_bytes(const vyrl_t *l)
{
	uint64_t n = 0;
	uint8_t *raw = vyrl_get_raw(l, &n);
	std::string out(reinterpret_cast<const char *>(raw), raw ? n : 0);
	std::free(raw);
	return out;
}

} // namespace vyr_test
