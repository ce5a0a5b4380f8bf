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

void *chunk(long n) { return std::malloc(static_cast<size_t>(n)); }

std::string take(char *s)
{
	std::string out = s ? s : "(null)";
	std::free(s);
	return out;
}

// Finding: vyr_obstack_finish closed the object with glibc's obstack_finish,
// whose alignment step adds an offset to a null pointer. That is undefined
// behaviour, and clang's UBSan stopped the first text call of the fuzz
// target field_readers on it; every string writer goes through this
// function. The object is now copied from its base; what a caller sees must
// not change: the object under construction comes back, objects finished
// before it don't, an empty object gives "", and the whole obstack is
// released (no leak under valgrind or LeakSanitizer).
TEST(Findings, ObstackFinishCopiesTheOpenObjectWithoutClosingIt)
{
	struct Case {
		const char *finished; // an object finished before, or NULL
		const char *open;     // the object being built
	} cases[] = {
		{nullptr, "secret:High"},
		{nullptr, ""},
		{"earlier", "later"},
		{"earlier", ""},
	};
	for (const Case &c : cases) {
		SCOPED_TRACE(c.open);
		struct obstack o;
		_obstack_begin(&o, 0, 0, chunk, std::free);
		if (c.finished != nullptr) {
			obstack_grow(&o, c.finished, std::strlen(c.finished));
			obstack_1grow(&o, '\0');
			ASSERT_NE(obstack_finish(&o), nullptr);
		}
		obstack_grow(&o, c.open, std::strlen(c.open));
		EXPECT_EQ(take(vyr_obstack_finish(&o)), c.open);
	}
	// The same path behind the string writers.
	vyrl_t *l = vyrl_get_new();
	ASSERT_NE(l, nullptr);
	EXPECT_EQ(take(vyrl_get_text(l, VYR_TEXT_NUMERIC)), "0:0:0x0:0x0!:");
	EXPECT_EQ(take(vyrl_asprintf(l, "%%")), "%");
	EXPECT_EQ(take(vyrl_asprintf(l, "")), "");
	vyrl_put(l);
}

// Finding (valgrind): mac_init took its value from malloc and set the
// fields one by one, and mac_dup copied field by field, so the 7 padding
// bytes of every mac_t handed out were whatever the heap held before. A
// program writing the value out as it lies in memory leaked those bytes,
// and comparing two values byte-wise read uninitialised memory. The heap is
// soiled first, so that a block handed out again would show old bytes.
TEST(Findings, MacValuesCarryNoStaleHeapBytes)
{
	for (int round = 0; round < 4; ++round) {
		void *dirty = std::malloc(sizeof(mac_t));
		ASSERT_NE(dirty, nullptr);
		std::memset(dirty, 0xa5, sizeof(mac_t));
		std::free(dirty);

		mac_t *m = mac_init(0x10003);
		ASSERT_NE(m, nullptr);
		mac_t expected;
		std::memset(&expected, 0, sizeof expected);
		expected.type = 0x10003;
		expected.type_low = 0x03;
		EXPECT_EQ(std::memcmp(m, &expected, sizeof expected), 0);

		std::memset(dirty = std::malloc(sizeof(mac_t)), 0xa5, sizeof(mac_t));
		std::free(dirty);
		mac_t *copy = mac_dup(m);
		ASSERT_NE(copy, nullptr);
		EXPECT_EQ(std::memcmp(copy, m, sizeof *m), 0);
		mac_free(copy);
		mac_free(m);
	}
}

} // namespace
} // namespace hardening
