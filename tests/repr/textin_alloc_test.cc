// Allocation failure in every reader that builds something: each allocation
// of a call fails once in turn. A failed call reports it (NULL or -1), leaves
// nothing allocated behind, and leaves the caller's text as it was for the
// copying forms. A call that absorbs a failure (a database that can't be
// opened still leaves the numbers) must give the full, correct result; the
// texts avoid names that also spell a number, which would read differently
// without their database.
#include <vyr/label.h>
#include <vyr/text.h>

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <vector>

#include <gtest/gtest.h>

#include "repr/textin_support.hh"
#include "support/failalloc.h"

namespace {

using namespace textin_test;

class TextInAlloc : public ::testing::Test {
protected:
	static void SetUpTestSuite() { start_databases(); }
};

std::vector<char> buffer(const char *text)
{
	return std::vector<char>(text, text + std::strlen(text) + 1);
}

template <class R>
struct Record;
template <>
struct Record<vyrml_t> {
	static bool same(const vyrml_t *a, const vyrml_t *b) { return vyrml_cmp(a, b) == 1; }
	static void put(vyrml_t *r) { vyrml_put(r); }
};
template <>
struct Record<vyrrl_t> {
	static bool same(const vyrrl_t *a, const vyrrl_t *b) { return vyrrl_cmp(a, b, 0) == 1; }
	static void put(vyrrl_t *r) { vyrrl_put(r); }
};
template <>
struct Record<vyrl_t> {
	static bool same(const vyrl_t *a, const vyrl_t *b) { return vyrl_cmp(a, b, 0) == 1; }
	static void put(vyrl_t *r) { vyrl_put(r); }
};

// Sweeps both forms of one record reader over `text`; the result read with
// every allocation succeeding is the reference.
template <class R>
void sweep_record(const char *text, R *(*copying)(const char *), R *(*in_place)(char *))
{
	SCOPED_TRACE(text);
	R *expected = copying(text);
	ASSERT_NE(expected, nullptr);
	long failures = 0;

	const std::vector<char> original = buffer(text);
	std::vector<char> kept = original;
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		R *got = inj.run([&] { return copying(kept.data()); });
		EXPECT_EQ(kept, original) << "the copying form changed the text";
		if (got == nullptr) {
			EXPECT_TRUE(inj.fired()) << "NULL without an allocation failure";
			++failures;
			return;
		}
		EXPECT_TRUE(Record<R>::same(got, expected));
		Record<R>::put(got);
	});

	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		std::vector<char> b = buffer(text);
		R *got = inj.run([&] { return in_place(b.data()); });
		if (got == nullptr) {
			EXPECT_TRUE(inj.fired()) << "NULL without an allocation failure";
			++failures;
			return;
		}
		EXPECT_TRUE(Record<R>::same(got, expected));
		Record<R>::put(got);
	});
	EXPECT_GT(failures, 0) << "no allocation failure was ever reported";
	Record<R>::put(expected);
}

TEST_F(TextInAlloc, MandatoryParts)
{
	for (const char *text : {"secret:High:alpha,beta:ccnr,ehole", "5:1:0x3:0x5", "7", ""})
		sweep_record<vyrml_t>(text, vyrml_get_from_text, vyrml_get_from_text_nc);
}

TEST_F(TextInAlloc, RoleParts)
{
	for (const char *text : {"5,3,5:1", "No:2", "9", ""})
		sweep_record<vyrrl_t>(text, vyrrl_get_from_text, vyrrl_get_from_text_nc);
}

TEST_F(TextInAlloc, WholeLabels)
{
	for (const char *text : {"secret:High:alpha,beta:ehole!5,3:1", "5:1:0x3:0x5!5,3:1",
	                         "1!", "!", ""})
		sweep_record<vyrl_t>(text, vyrl_get_from_text, vyrl_get_from_text_nc);
}

TEST_F(TextInAlloc, RoleList)
{
	long failures = 0;
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		std::vector<char> b = buffer("3,1,2,3");
		vyr_role_t *const sentinel = reinterpret_cast<vyr_role_t *>(&b);
		vyr_role_t *list = sentinel;
		uint32_t count = 77;
		const int rc = inj.run([&] { return vyr_roles_from_text(b.data(), &list, &count); });
		if (rc != 0) {
			EXPECT_EQ(rc, -1);
			EXPECT_TRUE(inj.fired());
			EXPECT_EQ(list, sentinel);
			EXPECT_EQ(count, 77u);
			++failures;
			return;
		}
		ASSERT_EQ(count, 3u);
		EXPECT_EQ(list[0].id, 3u);
		EXPECT_EQ(list[2].id, 1u);
		std::free(list);
	});
	EXPECT_GT(failures, 0);
}

// The copying field readers: a failed copy leaves the out value untouched.
TEST_F(TextInAlloc, CategoryAndTypeCopies)
{
	long failures = 0;
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		uint64_t cat = 0x5555;
		const int rc = inj.run([&] { return vyr_cat_from_text("0x8,0x1", &cat); });
		if (rc != 0) {
			EXPECT_TRUE(inj.fired());
			EXPECT_EQ(cat, 0x5555u);
			++failures;
			return;
		}
		EXPECT_EQ(cat, 0x9u);
	});
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		uint64_t cat = 0;
		const int rc = inj.run([&] { return vyr_cat_from_text("alpha,beta", &cat); });
		if (rc != 0) {
			EXPECT_TRUE(inj.fired());
			++failures;
			return;
		}
		EXPECT_EQ(cat, 0x3u);
	});
	vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		uint16_t type = 0x5a5a;
		const int rc = inj.run([&] { return vyr_type_from_text("ccnr,ehole", &type); });
		if (rc != 0) {
			EXPECT_TRUE(inj.fired());
			EXPECT_EQ(type, 0x5a5a);
			++failures;
			return;
		}
		EXPECT_EQ(type, 5);
	});
	EXPECT_GE(failures, 3);
}

} // namespace
