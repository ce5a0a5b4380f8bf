// Role lists: normalisation, constructors from arrays, and the operations
// that copy and grow a caller's array.
#include "label_test_util.hh"

#include <algorithm>
#include <random>
#include <set>
#include <sstream>
#include <string>
#include <utility>

using namespace label_test;
using vyr_test::FailAlloc;

namespace {

// Entries written as "<id><tag>", e.g. "5a 9b": the tag letter goes into
// attr so that entries with one id can be told apart.
std::vector<vyr_role_t> parse(const std::string &text)
{
	std::vector<vyr_role_t> out;
	std::istringstream in(text);
	std::string tok;
	while (in >> tok) {
		char tag = tok.back();
		out.push_back(role(std::stoull(tok.substr(0, tok.size() - 1)), static_cast<uint32_t>(tag)));
	}
	return out;
}

std::string show(const vyr_role_t *r, uint32_t from, uint32_t to)
{
	std::string s;
	for (uint32_t k = from; k < to; ++k) {
		if (!s.empty())
			s += ' ';
		s += std::to_string(r[k].id) + static_cast<char>(r[k].attr);
	}
	return s;
}

struct NormalizeRow {
	const char *input;
	const char *kept;
	const char *behind;
};

TEST(RoleNormalize, Table)
{
	const NormalizeRow rows[] = {
	    {"", "", ""},
	    {"7a", "7a", ""},
	    {"5a 9b 5c 7d", "9b 7d 5a", "5c"},
	    {"1a 1b 3c 3d", "3d 1a", "3c 1b"},
	    {"4a 4b 4c", "4a", "4c 4b"},
	    {"3a 7b 3c 9d 7e", "9d 7e 3a", "7b 3c"},
	    {"9a 5b 1c", "9a 5b 1c", ""},
	    {"1a 5b 9c", "9c 5b 1a", ""},
	    // Unsigned order: all ones first, 0 last.
	    {"0a 18446744073709551615b 5c", "18446744073709551615b 5c 0a", ""},
	    {"9223372036854775808a 1b", "9223372036854775808a 1b", ""},
	};
	for (const NormalizeRow &row : rows) {
		std::vector<vyr_role_t> v = parse(row.input);
		auto n = static_cast<uint32_t>(v.size());
		vyr_roles_normalize(v.data(), &n);
		EXPECT_EQ(show(v.data(), 0, n), row.kept) << "input " << row.input;
		EXPECT_EQ(show(v.data(), n, static_cast<uint32_t>(v.size())), row.behind) << "input " << row.input;
	}
}

TEST(RoleNormalize, RandomListsBecomeCanonicalPermutations)
{
	std::mt19937_64 rng(42);
	const uint64_t pool[] = {0, 1, 2, 3, 7, 8, 100, UINT64_MAX, UINT64_MAX - 1, uint64_t{1} << 63};
	for (int round = 0; round < 300; ++round) {
		std::vector<vyr_role_t> v(rng() % 30);
		for (std::size_t k = 0; k < v.size(); ++k)
			v[k] = role(pool[rng() % std::size(pool)], static_cast<uint32_t>(k));
		const std::vector<vyr_role_t> input = v;
		auto n = static_cast<uint32_t>(v.size());
		vyr_roles_normalize(v.data(), &n);

		for (uint32_t k = 1; k < n; ++k)
			ASSERT_GT(v[k - 1].id, v[k].id) << "round " << round;
		std::set<uint64_t> in_ids, out_ids;
		for (const auto &r : input)
			in_ids.insert(r.id);
		for (uint32_t k = 0; k < n; ++k)
			out_ids.insert(v[k].id);
		ASSERT_EQ(in_ids, out_ids) << "round " << round;
		// The whole buffer is a permutation of the input (attr is unique).
		std::vector<std::pair<uint32_t, uint64_t>> a, b;
		for (const auto &r : input)
			a.emplace_back(r.attr, r.id);
		for (const auto &r : v)
			b.emplace_back(r.attr, r.id);
		std::sort(b.begin(), b.end());
		ASSERT_EQ(a, b) << "round " << round;
	}
}

TEST(RoleParts, InitRolesNormalisesCopiesAndKeepsBufferSize)
{
	const std::vector<vyr_role_t> same = parse("4a 4b 4c");
	Rl r{vyrrl_get_new_init_roles(same.data(), 3, nullptr, 0)};
	ASSERT_NE(r, nullptr);
	EXPECT_EQ(r->nroles1, 1u);
	EXPECT_EQ(r->nroles2, 0u);
	EXPECT_EQ(r->roles2, nullptr);
	// The buffer still holds three entries: the removed ones lie behind.
	EXPECT_EQ(show(r->roles1, 0, 3), "4a 4c 4b");
	EXPECT_EQ(show(same.data(), 0, 3), "4a 4b 4c") << "the caller's array is only read";

	const std::vector<vyr_role_t> two = parse("1x 2y");
	Rl both{vyrrl_get_new_init_roles(two.data(), 2, two.data(), 1)};
	EXPECT_EQ(show(both->roles1, 0, both->nroles1), "2y 1x");
	EXPECT_EQ(show(both->roles2, 0, both->nroles2), "1x");
	EXPECT_NE(both->roles1, two.data());
}

TEST(RoleParts, AllocMakesArraysOfTheGivenSizes)
{
	Rl none{vyrrl_get_new_alloc(0, 0)};
	ASSERT_NE(none, nullptr);
	EXPECT_EQ(none->roles1, nullptr);
	EXPECT_EQ(none->roles2, nullptr);
	EXPECT_EQ(vyrrl_ucnt(none.get()), 1);

	Rl some{vyrrl_get_new_alloc(2, 0)};
	EXPECT_EQ(some->nroles1, 2u);
	EXPECT_EQ(some->nroles2, 0u);
	EXPECT_EQ(some->roles2, nullptr);
	// Writing every entry proves the room (the sanitizer build checks it).
	some->roles1[0] = role(2);
	some->roles1[1] = role(1);

	Rl other{vyrrl_get_new_alloc(0, 3)};
	EXPECT_EQ(other->roles1, nullptr);
	EXPECT_EQ(other->nroles2, 3u);
	other->roles2[2] = role(5);
}

TEST(RoleParts, MacRolesBuildsAWholeLabel)
{
	const std::vector<vyr_role_t> r1 = parse("1a 9b 1c");
	const std::vector<vyr_role_t> r2 = parse("3z");
	unsigned wide_lev = 0x102, wide_type = 0x30001;
	Label l{vyrl_get_new_init_mac_roles(static_cast<uint8_t>(wide_lev), 200, 0xF0F0, static_cast<uint16_t>(wide_type),
	                                    r1.data(), 3, r2.data(), 1)};
	ASSERT_NE(l, nullptr);
	EXPECT_EQ(vyrl_lev(l.get()), 2);
	EXPECT_EQ(vyrl_ilev(l.get()), 200);
	EXPECT_EQ(vyrl_cat(l.get()), 0xF0F0u);
	EXPECT_EQ(vyrl_type(l.get()), 1);
	EXPECT_EQ(show(l->rl->roles1, 0, l->rl->nroles1), "9b 1a");
	EXPECT_EQ(show(l->rl->roles2, 0, l->rl->nroles2), "3z");
	EXPECT_EQ(show(r1.data(), 0, 3), "1a 9b 1c");
	EXPECT_EQ(vyrl_ucnt(l.get()) + vyrml_ucnt(l->ml) + vyrrl_ucnt(l->rl), 3);
}

TEST(RoleEntries, RawSizeAndSingleEntries)
{
	EXPECT_EQ(vyr_roles_raw_size(0), 0u);
	EXPECT_EQ(vyr_roles_raw_size(5), 65u);

	Roles one{vyrr_get_new_init(UINT64_MAX, 0xDEADBEEF, 0x81)};
	ASSERT_NE(one, nullptr);
	EXPECT_EQ(one->id, UINT64_MAX);
	EXPECT_EQ(one->attr, 0xDEADBEEFu);
	EXPECT_EQ(one->rights, 0x81);
	Roles dup{duplicate_role(one.get())};
	ASSERT_NE(dup, nullptr);
	EXPECT_NE(dup.get(), one.get());
	EXPECT_EQ(vyr_role_cmp(dup.get(), one.get()), 1);
}

TEST(RoleEntries, CpyRejectsNullPointersAndCopiesBlocks)
{
	vyr_role_t src[2] = {role(5, 1, 1), role(3, 2, 2)};
	vyr_role_t dst[2] = {role(0), role(0)};
	EXPECT_EQ(vyrr_cpy(nullptr, src, 2), -1);
	EXPECT_EQ(vyrr_cpy(dst, nullptr, 2), -1);
	EXPECT_EQ(dst[0].id, 0u);
	EXPECT_EQ(vyrr_cpy(dst, src, 0), 0);
	EXPECT_EQ(dst[0].id, 0u);
	EXPECT_EQ(vyrr_cpy(dst, src, 2), 0);
	EXPECT_EQ(std::memcmp(dst, src, sizeof src), 0);
}

TEST(RoleEntries, CompareLooksAtIdAttrAndRightsOnly)
{
	vyr_role_t a, b;
	std::memset(&a, 0x11, sizeof a);
	std::memset(&b, 0x22, sizeof b);
	a.id = b.id = 7;
	a.attr = b.attr = 8;
	a.rights = b.rights = 9;
	EXPECT_EQ(vyr_role_cmp(&a, &b), 1) << "padding differs only";
	EXPECT_EQ(vyr_role_cmp(&a, &a), 1);

	struct Row {
		void (*change)(vyr_role_t &);
	} rows[] = {
	    {[](vyr_role_t &r) { r.id ^= uint64_t{1} << 63; }},
	    {[](vyr_role_t &r) { r.attr ^= 1; }},
	    {[](vyr_role_t &r) { r.rights ^= 0x80; }},
	};
	for (const Row &row : rows) {
		vyr_role_t c = a;
		row.change(c);
		EXPECT_EQ(vyr_role_cmp(&a, &c), 0);
		EXPECT_EQ(vyr_role_cmp(&c, &a), 0);
	}
}

// ---- duplicate_mass_all_roles ----------------------------------------------------

TEST(RoleArrays, DuplicateMassReplacesOldByACopy)
{
	const std::vector<vyr_role_t> src = parse("5a 6b");
	vyr_role_t *result = nullptr;
	uint32_t count = 3;
	std::size_t left = blocks_left_by([&] {
		vyr_role_t *old = heap_roles(parse("1x 2y 3z"));
		result = duplicate_mass_all_roles(src.data(), 2, old, &count);
	});
	EXPECT_EQ(left, 1u) << "old released, one new array";
	ASSERT_NE(result, nullptr);
	EXPECT_EQ(count, 2u);
	EXPECT_EQ(show(result, 0, 2), "5a 6b");
	std::free(result);
}

TEST(RoleArrays, DuplicateMassWithNothingToCopyLeavesOldAlone)
{
	const std::vector<vyr_role_t> src = parse("5a");
	Roles old{heap_roles(parse("1x 2y"))};
	uint32_t count = 2;
	EXPECT_EQ(duplicate_mass_all_roles(src.data(), 0, old.get(), &count), nullptr);
	EXPECT_EQ(duplicate_mass_all_roles(nullptr, 1, old.get(), &count), nullptr);
	EXPECT_EQ(count, 2u);
	EXPECT_EQ(show(old.get(), 0, 2), "1x 2y") << "still valid";

	// A count of 0 means old isn't looked at, and so isn't released.
	count = 0;
	Roles copy{duplicate_mass_all_roles(src.data(), 1, old.get(), &count)};
	EXPECT_EQ(count, 1u);
	EXPECT_EQ(show(old.get(), 0, 2), "1x 2y");
}

TEST(RoleArrays, DuplicateMassMayCopyFromOldItself)
{
	vyr_role_t *old = heap_roles(parse("1x 2y"));
	uint32_t count = 2;
	Roles copy{duplicate_mass_all_roles(old, 2, old, &count)};
	ASSERT_NE(copy, nullptr);
	EXPECT_EQ(show(copy.get(), 0, count), "1x 2y");
}

// ---- duplicate_and_add_mass_all_roles ---------------------------------------------

TEST(RoleArrays, DuplicateAndAddAppendsUnsorted)
{
	const std::vector<vyr_role_t> add = parse("9c");
	vyr_role_t *out = nullptr;
	uint32_t count = 2;
	std::size_t left = blocks_left_by([&] {
		vyr_role_t *old = heap_roles(parse("1a 5b"));
		out = duplicate_and_add_mass_all_roles(add.data(), 1, old, &count);
	});
	EXPECT_EQ(left, 1u) << "old released";
	EXPECT_EQ(count, 3u);
	EXPECT_EQ(show(out, 0, count), "1a 5b 9c");
	std::free(out);

	// No old entries: old isn't looked at.
	count = 0;
	Roles fresh{duplicate_and_add_mass_all_roles(add.data(), 1, reinterpret_cast<vyr_role_t *>(0x10), &count)};
	EXPECT_EQ(count, 1u);
	EXPECT_EQ(show(fresh.get(), 0, 1), "9c");

	// Nothing at all: a valid allocation of no entries.
	count = 0;
	Roles empty{duplicate_and_add_mass_all_roles(add.data(), 0, nullptr, &count)};
	EXPECT_NE(empty, nullptr);
	EXPECT_EQ(count, 0u);
}

TEST(RoleArrays, DuplicateAndAddRefusesMissingArrays)
{
	Roles old{heap_roles(parse("1a"))};
	uint32_t count = 1;
	EXPECT_EQ(duplicate_and_add_mass_all_roles(nullptr, 1, old.get(), &count), nullptr);
	const std::vector<vyr_role_t> add = parse("2b");
	EXPECT_EQ(duplicate_and_add_mass_all_roles(add.data(), 1, nullptr, &count), nullptr);
	EXPECT_EQ(count, 1u);
	EXPECT_EQ(show(old.get(), 0, 1), "1a");
}

// ---- rback_only_new_role_add --------------------------------------------------------

TEST(RoleArrays, InsertKeepsCanonicalOrder)
{
	struct Row {
		uint64_t id;
		const char *result;
	} rows[] = {{8, "9a 8n 7b 3c"}, {10, "10n 9a 7b 3c"}, {1, "9a 7b 3c 1n"}};
	for (const Row &row : rows) {
		uint32_t count = 3;
		vyr_role_t *out = nullptr;
		const vyr_role_t r = role(row.id, 'n');
		std::size_t left = blocks_left_by([&] {
			vyr_role_t *list = heap_roles(parse("9a 7b 3c"));
			out = rback_only_new_role_add(&r, list, &count);
		});
		EXPECT_EQ(left, 1u) << "a new array, the old one released; id " << row.id;
		EXPECT_EQ(count, 4u);
		EXPECT_EQ(show(out, 0, count), row.result);
		std::free(out);
	}
}

TEST(RoleArrays, InsertOfAPresentIdKeepsTheList)
{
	Roles list{heap_roles(parse("9a 7b 3c"))};
	uint32_t count = 3;
	const vyr_role_t r = role(7, 'n', 0xF);
	EXPECT_EQ(rback_only_new_role_add(&r, list.get(), &count), list.get());
	EXPECT_EQ(count, 3u);
	EXPECT_EQ(show(list.get(), 0, 3), "9a 7b 3c") << "the present entry keeps its attr";
}

TEST(RoleArrays, InsertIntoAnEmptyListMakesOneEntry)
{
	const vyr_role_t r = role(4, 'n', 2);
	for (uint32_t start : {0u, 5u}) {
		uint32_t count = start;
		Roles out{rback_only_new_role_add(&r, nullptr, &count)};
		ASSERT_NE(out, nullptr);
		EXPECT_EQ(count, 1u);
		EXPECT_EQ(vyr_role_cmp(out.get(), &r), 1);
	}
	// Count 0 with a list: the list isn't looked at or released.
	Roles list{heap_roles(parse("9a"))};
	uint32_t count = 0;
	Roles out{rback_only_new_role_add(&r, list.get(), &count)};
	EXPECT_NE(out.get(), list.get());
	EXPECT_EQ(count, 1u);
	EXPECT_EQ(show(list.get(), 0, 1), "9a");
}

// ---- Allocation failure ----------------------------------------------------------

// The growing operations keep the caller's array valid when they fail.
TEST(RoleArraysAllocFailure, GrowingKeepsTheOldArrayOnFailure)
{
	const vyr_role_t r = role(8, 'n');
	using Grow = vyr_role_t *(*)(const vyr_role_t *, vyr_role_t *, uint32_t *);
	const std::pair<Grow, const char *> ops[] = {
	    {[](const vyr_role_t *x, vyr_role_t *l, uint32_t *c) { return rback_only_new_role_add(x, l, c); },
	     "9a 8n 7b 3c"},
	    {[](const vyr_role_t *, vyr_role_t *l, uint32_t *c) {
		     const vyr_role_t two[] = {role(1, 'z'), role(2, 'z')};
		     return duplicate_and_add_mass_all_roles(two, 2, l, c);
	     },
	     "9a 7b 3c 1z 2z"},
	};
	for (const auto &[grow, expect] : ops) {
		long attempts = vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			vyr_role_t *list = heap_roles(parse("9a 7b 3c"));
			uint32_t count = 3;
			vyr_role_t *out = inj.run([&] { return grow(&r, list, &count); });
			if (inj.fired()) {
				EXPECT_EQ(out, nullptr);
				EXPECT_EQ(count, 3u);
				EXPECT_EQ(show(list, 0, 3), "9a 7b 3c");
				std::free(list);
				return;
			}
			EXPECT_EQ(show(out, 0, count), expect);
			std::free(out);
		});
		EXPECT_EQ(attempts, 2);
	}
}

TEST(RoleArraysAllocFailure, DuplicateMassReleasesOldEvenOnFailure)
{
	const std::vector<vyr_role_t> src = parse("5a 6b");
	const std::vector<vyr_role_t> old_entries = parse("1x 2y");
	long attempts = vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		uint32_t count = 2;
		bool have_old = false;
		// old is made inside the window so that the leak check sees it.
		vyr_role_t *out = inj.run([&]() -> vyr_role_t * {
			vyr_role_t *old = heap_roles(old_entries);
			if (!old)
				return nullptr;
			have_old = true;
			return duplicate_mass_all_roles(src.data(), 2, old, &count);
		});
		if (inj.fired()) {
			EXPECT_EQ(out, nullptr);
			EXPECT_EQ(count, 2u);
			return; // the leak check proves old was released
		}
		EXPECT_TRUE(have_old);
		EXPECT_EQ(show(out, 0, count), "5a 6b");
		std::free(out);
	});
	EXPECT_EQ(attempts, 3);
}

} // namespace
