// Equality, the not-greater order and the child/parent relation.
#include "label_test_util.hh"

#include <algorithm>
#include <iterator>

using namespace label_test;

namespace {

// Every field and blob byte counts; padding, ucnt and the blob's address don't.
TEST(LabelEquality, MandatoryParts)
{
	unsigned char bytes_a[] = {1, 2, 3}, bytes_b[] = {1, 2, 3}, bytes_c[] = {1, 2, 4};
	vyrml_t base = part(1, 2, 3, 4), same = base, diff[6];
	base.blob = bytes_a, base.blob_size = 3;
	std::memset(reinterpret_cast<unsigned char *>(&same) + 2, 0xEE, 6);
	same.ucnt = 9, same.blob = bytes_b, same.blob_size = 3;
	std::fill(std::begin(diff), std::end(diff), base);
	diff[0].blob = bytes_c, diff[1].blob_size = 2, diff[2].lev = 201, diff[3].ilev = 0;
	diff[4].cat |= uint64_t{1} << 63, diff[5].type |= 0x8000;
	EXPECT_EQ(vyrml_cmp(&base, &same) + vyrml_cmp(&same, &base), 2);
	for (const vyrml_t &d : diff)
		EXPECT_EQ(vyrml_cmp(&base, &d) + vyrml_cmp(&d, &base), 0) << (&d - diff);
}

TEST(LabelEquality, RoleListsAndWholeLabels)
{
	vyr_role_t a95[] = {role(9, 1, 1), role(5, 2, 2)}, b95[] = {role(9, 1, 1), role(5, 2, 2)};
	vyr_role_t b59[] = {role(5, 2, 2), role(9, 1, 1)}, b95r[] = {role(9, 1, 1), role(5, 2, 3)};
	vyr_role_t b95a[] = {role(9, 1, 1), role(5, 3, 2)}, b95pad[] = {role(9, 1, 1), role(5, 2, 2), role(1)};
	std::memset(reinterpret_cast<unsigned char *>(&b95pad[0]) + 13, 0x5A, 3);
	vyr_role_t *some = reinterpret_cast<vyr_role_t *>(0x10), *bad = some - 1; // never followed
	const struct {
		const char *what;
		vyrrl_t a, b;
		int expect;
	} rows[] = {
	    {"same entries", {2, 0, a95, nullptr, 1}, {2, 0, b95, nullptr, 7}, 1},
	    {"other order", {2, 0, a95, nullptr, 1}, {2, 0, b59, nullptr, 1}, 0},
	    {"rights differ", {2, 0, a95, nullptr, 1}, {2, 0, b95r, nullptr, 1}, 0},
	    {"attr differs", {2, 0, a95, nullptr, 1}, {2, 0, b95a, nullptr, 1}, 0},
	    {"entries behind the count and padding ignored", {2, 0, a95, nullptr, 1}, {2, 0, b95pad, nullptr, 1}, 1},
	    {"counts differ", {2, 0, a95, nullptr, 1}, {1, 0, b95, nullptr, 1}, 0},
	    {"count 0, one list NULL", {0, 0, nullptr, nullptr, 1}, {0, 0, some, nullptr, 1}, 0},
	    {"count 0, both lists set", {0, 0, some, nullptr, 1}, {0, 0, some + 1, nullptr, 1}, 1},
	    {"second list: order", {0, 2, nullptr, a95, 1}, {0, 2, nullptr, b59, 1}, 0},
	    {"same first pointer, second differs", {2, 1, a95, a95, 1}, {2, 1, a95, b59, 1}, 0},
	};
	for (const auto &row : rows) {
		EXPECT_EQ(vyrrl_cmp(&row.a, &row.b, 0), row.expect) << row.what;
		EXPECT_EQ(vyrrl_cmp(&row.b, &row.a, 0xFFFFFFFFu), row.expect) << row.what << " (third argument)";
	}
	// One record against itself reads no field (sizes non-zero, pointers bogus).
	vyrml_t m = part(1, 1, 1);
	m.blob_size = 5;
	vyrrl_t r{4, 0, bad, nullptr, 1};
	vyrl_t l{&m, &r, 1}, twin{&m, &r, 1};
	EXPECT_EQ(vyrml_cmp(&m, &m) + vyrrl_cmp(&r, &r, 0) + vyr_role_cmp(bad, bad) + vyrl_cmp(&l, &twin, 0), 4);
	Label a{rich_label()}, b{rich_label()};
	EXPECT_EQ(vyrl_cmp(a.get(), b.get(), 0), 1);
	b->rl->roles2[1].attr ^= 1;
	EXPECT_EQ(vyrl_cmp(a.get(), b.get(), 0), 0) << "equal ml, different roles";
	b->rl->roles2[1].attr ^= 1;
	b->ml->blob[2] ^= 0xFF;
	EXPECT_EQ(vyrl_cmp(a.get(), b.get(), 0), 0) << "different blob, equal roles";
}

TEST(LabelOrder, NotGreater)
{
	const struct {
		vyrml_t a, b;
		int a_b, b_a;
	} rows[] = {
	    {part(3, 3, 5), part(3, 3, 5), 0, 0}, {part(0, 0, 1), part(0, 0, 2), -13, -13},
	    {part(100, 0, 0), part(200, 0, 0), 0, -13}, {part(0, 100, 0), part(0, 200, 0), 0, -13},
	    {part(1, 5, 0x1), part(2, 2, 0x3), -13, -13}, {part(0, 0, uint64_t{1} << 63), part(0, 0, UINT64_MAX), 0, -13},
	    {part(1, 1, 1, 7), part(1, 1, 1, 0), 0, 0}, // type plays no part
	};
	for (const auto &row : rows)
		EXPECT_EQ(std::pair(vyrml_notg(&row.a, &row.b), vyrml_notg(&row.b, &row.a)), std::pair(row.a_b, row.b_a))
		    << "row " << (&row - rows);
}

TEST(LabelChildParent, Table)
{
	const struct {
		const char *what;
		vyrml_t child, parent;
		int by_type[4]; // result for parent type 0, 1 (ccnr), 2 (ccnri), 3
	} rows[] = {
	    {"equal", part(2, 2, 3), part(2, 2, 3), {0, 0, 0, 0}},
	    {"lower lev", part(1, 2, 3), part(2, 2, 3), {-13, 0, -13, 0}},
	    {"lower ilev", part(2, 1, 3), part(2, 2, 3), {-13, -13, 0, 0}},
	    {"fewer categories", part(2, 2, 1), part(2, 2, 3), {-13, 0, -13, 0}},
	    {"lower lev and ilev", part(1, 1, 3), part(2, 2, 3), {-13, -13, -13, 0}},
	    {"higher lev", part(3, 2, 3), part(2, 2, 3), {-13, -13, -13, -13}},
	    {"higher ilev", part(2, 3, 3), part(2, 2, 3), {-13, -13, -13, -13}},
	    {"foreign category", part(2, 2, 4), part(2, 2, 3), {-13, -13, -13, -13}},
	    {"unsigned lev", part(100, 2, 3), part(200, 2, 3), {-13, 0, -13, 0}},
	};
	for (const auto &row : rows) {
		for (uint16_t t = 0; t < 4; ++t) {
			// ehole and the upper bits change nothing; the child's type isn't read.
			vyrml_t parent = row.parent, child = row.child;
			parent.type = t;
			EXPECT_EQ(vyrml_child_parent(&row.child, &parent), row.by_type[t]) << row.what << ", type " << t;
			parent.type = static_cast<uint16_t>(t | VYR_TYPE_EHOLE | 0xFF00);
			child.type = 0xFFFF;
			EXPECT_EQ(vyrml_child_parent(&child, &parent), row.by_type[t]) << row.what << ", type " << (t | 4);
		}
	}
}

// The label forms of the relations and of the mandatory decision look at the
// mandatory parts alone, subject or child first.
TEST(LabelRelations, LabelFormsIgnoreTypeBlobAndRoles)
{
	Label child{rich_label()}, parent{vyrl_get_new_init_mac(3, 2, 0x55, 0)};
	EXPECT_EQ(vyrl_notg(child.get(), parent.get()) + vyr_child_parent(child.get(), parent.get()), 0);
	vyrl_set_lev(child.get(), 2);
	EXPECT_EQ(vyrl_notg(parent.get(), child.get()), -13);
	EXPECT_EQ(vyr_child_parent(child.get(), parent.get()), -13) << "lower lev needs the parent's ccnr";
	EXPECT_EQ(vyrl_permission(child.get(), parent.get(), VYR_REQ_READ), -1);
	EXPECT_EQ(vyrl_permission(parent.get(), child.get(), VYR_REQ_READ), 0);
	vyrl_set_type(parent.get(), VYR_TYPE_CCNR);
	EXPECT_EQ(vyr_child_parent(child.get(), parent.get()), 0);
}

} // namespace
