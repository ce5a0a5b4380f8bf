// Role lists: normalisation, constructors from arrays, and the operations
// that copy and grow a caller's array.
#include "label_test_util.hh"

#include <sstream>
#include <string>

using namespace label_test;

namespace {

// Entries written as "<id><tag>", e.g. "5a 9b": the tag letter goes into attr.
std::vector<vyr_role_t> parse(const std::string &text)
{
	std::vector<vyr_role_t> out;
	std::istringstream in(text);
	for (std::string t; in >> t;)
		out.push_back(role(std::stoull(t.substr(0, t.size() - 1)), static_cast<uint32_t>(t.back())));
	return out;
}

std::string show(const vyr_role_t *r, uint32_t from, uint32_t to)
{
	std::string s;
	for (uint32_t k = from; k < to; ++k)
		s += (s.empty() ? "" : " ") + std::to_string(r[k].id) + static_cast<char>(r[k].attr);
	return s;
}

// Which of several entries with one id survives, and where the removed ones
// end up, follows from the exact sequence of exchanges.
TEST(RoleNormalize, Table)
{
	const struct {
		const char *input, *kept, *behind;
	} rows[] = {
	    {"", "", ""}, {"7a", "7a", ""}, {"5a 9b 5c 7d", "9b 7d 5a", "5c"}, {"1a 1b 3c 3d", "3d 1a", "3c 1b"},
	    {"4a 4b 4c", "4a", "4c 4b"}, {"3a 7b 3c 9d 7e", "9d 7e 3a", "7b 3c"}, {"1a 5b 9c", "9c 5b 1a", ""},
	    {"0a 18446744073709551615b 5c", "18446744073709551615b 5c 0a", ""}, // unsigned order
	};
	for (const auto &row : rows) {
		std::vector<vyr_role_t> v = parse(row.input);
		auto n = static_cast<uint32_t>(v.size());
		vyr_roles_normalize(v.data(), &n);
		EXPECT_EQ(show(v.data(), 0, n), row.kept) << row.input;
		EXPECT_EQ(show(v.data(), n, static_cast<uint32_t>(v.size())), row.behind) << row.input;
	}
}

TEST(RoleParts, ConstructorsNormaliseACopyAndSizeExactly)
{
	const std::vector<vyr_role_t> same = parse("4a 4b 4c"), two = parse("1x 2y");
	Rl r{vyrrl_get_new_init_roles(same.data(), 3, two.data(), 2)};
	ASSERT_NE(r, nullptr);
	EXPECT_EQ(r->nroles1, 1u);
	EXPECT_EQ(show(r->roles1, 0, 3), "4a 4c 4b") << "a buffer of the input size, removed entries behind";
	EXPECT_EQ(show(r->roles2, 0, r->nroles2), "2y 1x");
	EXPECT_EQ(show(same.data(), 0, 3), "4a 4b 4c") << "the caller's array is only read";
	Rl a{vyrrl_get_new_alloc(2, 0)};
	ASSERT_NE(a, nullptr);
	EXPECT_EQ(a->nroles1, 2u);
	a->roles1[1] = role(1); // the sanitizer build checks the room
	EXPECT_EQ(a->roles2, nullptr) << "a count of 0 leaves the array NULL";
}

TEST(RoleEntries, SingleEntriesSizesAndBlockCopies)
{
	EXPECT_EQ(vyr_roles_raw_size(5), 65u);
	EXPECT_EQ(vyr_roles_size(uint64_t{1} << 40), uint64_t{1} << 44) << "no 32-bit truncation";
	const vyr_role_t expect = role(UINT64_MAX, 0xDEADBEEF, 0x81);
	Roles one{vyrr_get_new_init(UINT64_MAX, 0xDEADBEEF, 0x81)}, dup{duplicate_role(&expect)};
	ASSERT_TRUE(one && dup);
	EXPECT_EQ(vyr_role_cmp(one.get(), &expect) + vyr_role_cmp(dup.get(), &expect), 2);
	vyr_role_t src[2], dst[2] = {}; // block copies carry the padding bytes along
	std::memset(src, 0xAB, sizeof src);
	Roles copy{vyr_role_dup(src, 2)};
	ASSERT_NE(copy, nullptr);
	EXPECT_EQ(std::memcmp(copy.get(), src, sizeof src), 0);
	EXPECT_EQ(vyrr_cpy(nullptr, src, 2) + vyrr_cpy(dst, nullptr, 2) + vyrr_cpy(dst, src, 0), -2);
	EXPECT_EQ(dst[0].id, 0u);
	EXPECT_EQ(vyrr_cpy(dst, src, 2), 0);
	EXPECT_EQ(std::memcmp(dst, src, sizeof src), 0);
}

// The three operations on a caller's array: the entry r is inserted, appended, or copied in place of the list.
using Op = vyr_role_t *(*)(const vyr_role_t *r, vyr_role_t *list, uint32_t *count);
vyr_role_t *insert(const vyr_role_t *r, vyr_role_t *l, uint32_t *c) { return rback_only_new_role_add(r, l, c); }
vyr_role_t *append(const vyr_role_t *r, vyr_role_t *l, uint32_t *c) { return duplicate_and_add_mass_all_roles(r, 1, l, c); }
vyr_role_t *replace(const vyr_role_t *r, vyr_role_t *l, uint32_t *c) { return duplicate_mass_all_roles(r, 1, l, c); }

// The caller's array is made inside the watched window, so the leak check
// also proves its fate: released on success by all three; on failure kept by
// the growing operations, already released by duplicate_mass_all_roles.
TEST(RoleArrays, CopyAndGrowUnderAllocationFailure)
{
	const struct {
		Op op;
		uint64_t id;
		const char *result;
		bool failure_keeps_old;
	} rows[] = {
	    {insert, 8, "9a 8n 7b 3c", true},   {insert, 10, "10n 9a 7b 3c", true}, {insert, 1, "9a 7b 3c 1n", true},
	    {append, 10, "9a 7b 3c 10n", true}, {replace, 5, "5n", false},
	};
	const std::vector<vyr_role_t> start = parse("9a 7b 3c");
	for (const auto &row : rows) {
		const vyr_role_t r = role(row.id, 'n');
		vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			uint32_t count = 3;
			vyr_role_t *list = nullptr;
			vyr_role_t *out = inj.run([&]() -> vyr_role_t * {
				list = heap_roles(start);
				return list ? row.op(&r, list, &count) : nullptr;
			});
			if (!inj.fired()) {
				EXPECT_EQ(show(out, 0, count), row.result);
				return std::free(out);
			}
			EXPECT_TRUE(out == nullptr && count == 3) << row.result;
			if (list && row.failure_keeps_old) {
				EXPECT_EQ(show(list, 0, 3), "9a 7b 3c");
				std::free(list);
			}
		});
	}
}

// Where there is nothing to copy, add or release, the caller's array stays.
TEST(RoleArrays, EdgeCasesLeaveTheCallersArrayAlone)
{
	Roles old{heap_roles(parse("9a 7b"))};
	const vyr_role_t r = role(7, 'n', 0xF);
	uint32_t count = 2;
	EXPECT_EQ(duplicate_mass_all_roles(&r, 0, old.get(), &count), nullptr);
	EXPECT_EQ(duplicate_mass_all_roles(nullptr, 1, old.get(), &count), nullptr);
	EXPECT_EQ(duplicate_and_add_mass_all_roles(nullptr, 1, old.get(), &count), nullptr);
	EXPECT_EQ(duplicate_and_add_mass_all_roles(&r, 1, nullptr, &count), nullptr);
	EXPECT_EQ(rback_only_new_role_add(&r, old.get(), &count), old.get()) << "a present id: the list itself";
	EXPECT_EQ(count, 2u);
	// A count of 0: the old array is neither read nor released (it would be freed twice here).
	for (Op op : {insert, append, replace}) {
		count = 0;
		Roles out{op(&r, old.get(), &count)};
		ASSERT_NE(out, nullptr);
		EXPECT_EQ(count + vyr_role_cmp(out.get(), &r), 2u);
	}
	count = 5; // a NULL list with a stale count: one entry
	Roles one{rback_only_new_role_add(&r, nullptr, &count)};
	EXPECT_EQ(count, 1u);
	count = 0; // nothing at all to append: a valid allocation of no entries
	Roles empty{duplicate_and_add_mass_all_roles(&r, 0, nullptr, &count)};
	EXPECT_TRUE(empty && count == 0);
	vyr_role_t *self = heap_roles(parse("1x 2y")); // the copy is made before the old array goes
	count = 2;
	Roles copy{duplicate_mass_all_roles(self, 2, self, &count)};
	EXPECT_EQ(show(copy.get(), 0, count), "1x 2y");
}

} // namespace
