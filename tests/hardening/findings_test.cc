// Regression tests of findings made while hardening, one per finding.
#include <vyr/classic.h>
#include <vyr/label.h>
#include <vyr/text.h>

#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>
#include <obstack.h>
#include <string>

namespace hardening {
namespace {

std::string take(char *s)
{
	std::string out = s ? s : "(null)";
	std::free(s);
	return out;
}

// vyr_obstack_finish used glibc's obstack_finish, whose alignment step offsets
// a null pointer (UBSan stopped a fuzz target on it). Its copy of the open
// object must come back whole, without objects finished before it.
TEST(Findings, ObstackFinishCopiesTheOpenObjectWithoutClosingIt)
{
	const char *const cases[][2] = {{nullptr, "secret:High"}, {nullptr, ""}, {"earlier", "later"}, {"earlier", ""}};
	for (const auto &[finished, open] : cases) {
		SCOPED_TRACE(open);
		struct obstack o;
		obstack_specify_allocation(&o, 0, 0, std::malloc, std::free);
		if (finished != nullptr) {
			obstack_grow0(&o, finished, std::strlen(finished));
			ASSERT_NE(obstack_finish(&o), nullptr);
		}
		obstack_grow(&o, open, std::strlen(open));
		EXPECT_EQ(take(vyr_obstack_finish(&o)), open);
	}
	vyrl_t l{};
	EXPECT_EQ(take(vyrl_asprintf(&l, "")), "") << "a string writer ending in an empty object";
}

// mac_init and mac_dup set mac_t values field by field, so their padding
// carried stale heap bytes (soiled here first, to show).
TEST(Findings, MacValuesCarryNoStaleHeapBytes)
{
	auto soil = [] { std::free(std::memset(std::malloc(sizeof(mac_t)), 0xa5, sizeof(mac_t))); };
	soil();
	mac_t *m = mac_init(0x10003);
	ASSERT_NE(m, nullptr);
	mac_t expected;
	std::memset(&expected, 0, sizeof expected);
	expected.type = 0x10003;
	expected.type_low = 0x03;
	EXPECT_EQ(std::memcmp(m, &expected, sizeof expected), 0);
	soil();
	mac_t *copy = mac_dup(m);
	EXPECT_TRUE(copy != nullptr && std::memcmp(copy, m, sizeof *m) == 0);
	mac_free(copy);
	mac_free(m);
}

} // namespace
} // namespace hardening
