// Fixture of the text writer tests that run against "textoutmem".
#pragma once

#include "repr/textout_memdb.h"
#include "repr/textout_support.hh"

#include <vyr/text.h>

#include <gtest/gtest.h>

#include <cstdlib>
#include <initializer_list>
#include <string>
#include <vector>

namespace textout_test {

// A label assembled on the stack: the writers only read the fields.
struct StackLabel {
	vyrml_t ml{};
	vyrrl_t rl{};
	vyrl_t l{};
	std::vector<vyr_role_t> r1, r2;

	StackLabel(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type,
	           std::initializer_list<uint64_t> ids1 = {}, std::initializer_list<uint64_t> ids2 = {})
	{
		ml.lev = lev;
		ml.ilev = ilev;
		ml.cat = cat;
		ml.type = type;
		ml.ucnt = 1;
		for (uint64_t id : ids1)
			r1.push_back(vyr_role_t{id, 0, 0});
		for (uint64_t id : ids2)
			r2.push_back(vyr_role_t{id, 0, 0});
		rl.nroles1 = static_cast<uint32_t>(r1.size());
		rl.nroles2 = static_cast<uint32_t>(r2.size());
		rl.roles1 = r1.empty() ? nullptr : r1.data();
		rl.roles2 = r2.empty() ? nullptr : r2.data();
		rl.ucnt = 1;
		l.ml = &ml;
		l.rl = &rl;
		l.ucnt = 1;
	}
	StackLabel(const StackLabel &) = delete;
	StackLabel &operator=(const StackLabel &) = delete;
};

// Takes over a string returned by the library; "<null>" stands for NULL.
inline std::string take(char *s)
{
	if (s == nullptr)
		return "<null>";
	std::string r(s);
	std::free(s);
	return r;
}

// The control functions of "textoutmem", looked up in the loaded plug-in.
// (The plug-in is not linked into the program: the databases' dlopen of a
// library the program already maps leaves bookkeeping that the leak checker
// reports.)
struct MemDb {
	void (*reset)(void);
	void (*add_level)(const char *, uint8_t);
	void (*add_category)(const char *, uint64_t);
	void (*set_open_ok)(bool, bool);
	void (*set_catset_result)(int);
	textoutmem_stats (*get_stats)(void);
	void (*clear_stats)(void);
};
const MemDb &mem();

// Names served in every test:
//   levels      public 0, secret 5, top 255 (2 has no name)
//   categories  alpha 0x1, beta 0x2, pair 0x6, wide 0x30, eps 0x20, in this
//               walk order; nothing is named 0x8 or 0x0.
class TextOut : public ::testing::Test {
protected:
	static void SetUpTestSuite();
	void SetUp() override;
	// Whether the back-end started; checked by every test, so that a failed
	// start fails each test instead of passing as skipped.
	static inline bool started_ = false;
	void TearDown() override { set_translation(nullptr); }

	static textoutmem_stats stats() { return mem().get_stats(); }
};

} // namespace textout_test
