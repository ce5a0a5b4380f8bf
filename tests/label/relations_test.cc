// Equality, the not-greater order and the child/parent relation.
#include "label_test_util.hh"

using namespace label_test;

namespace {

TEST(LabelEquality, MandatoryParts)
{
	// Static, so that the row lambdas can point blobs at them.
	static unsigned char bytes_a[] = {1, 2, 3}, bytes_b[] = {1, 2, 3}, bytes_c[] = {1, 2, 4};
	vyrml_t base = part(1, 2, 3, 4);
	base.blob = bytes_a;
	base.blob_size = 3;
	struct Row {
		const char *what;
		void (*change)(vyrml_t &);
		int expect;
	} rows[] = {
	    {"padding, ucnt and blob address differ",
	     [](vyrml_t &m) {
		     std::memset(reinterpret_cast<unsigned char *>(&m) + 2, 0xEE, 6);
		     m.ucnt = 9;
		     m.blob = bytes_b;
	     },
	     1},
	    {"one blob byte", [](vyrml_t &m) { m.blob = bytes_c; }, 0},
	    {"blob_size", [](vyrml_t &m) { m.blob_size = 2; }, 0},
	    {"lev", [](vyrml_t &m) { m.lev = 201; }, 0},
	    {"ilev", [](vyrml_t &m) { m.ilev = 0; }, 0},
	    {"cat high bit", [](vyrml_t &m) { m.cat |= uint64_t{1} << 63; }, 0},
	    {"type high bit", [](vyrml_t &m) { m.type |= 0x8000; }, 0},
	};
	for (const Row &row : rows) {
		vyrml_t other = base;
		row.change(other);
		EXPECT_EQ(vyrml_cmp(&base, &other), row.expect) << row.what;
		EXPECT_EQ(vyrml_cmp(&other, &base), row.expect) << row.what;
	}
}

TEST(LabelEquality, SelfComparisonReadsNoField)
{
	// Following these records' pointers would crash: blob and roles1 are
	// bogus under non-zero sizes.
	vyrml_t m = part(1, 1, 1);
	m.blob_size = 5;
	auto *bad = reinterpret_cast<vyr_role_t *>(0x8);
	vyrrl_t r{4, 0, bad, nullptr, 1};
	EXPECT_EQ(vyrml_cmp(&m, &m), 1);
	EXPECT_EQ(vyrrl_cmp(&r, &r, 0), 1);
	EXPECT_EQ(vyr_role_cmp(bad, bad), 1);
	vyrl_t l{&m, &r, 1}, twin{&m, &r, 1};
	EXPECT_EQ(vyrl_cmp(&l, &l, 0), 1);
	EXPECT_EQ(vyrl_cmp(&l, &twin, 0), 1) << "labels sharing both parts";
}

TEST(LabelEquality, RoleEntriesAndParts)
{
	vyr_role_t a95[] = {role(9, 1, 1), role(5, 2, 2)};
	vyr_role_t b95[] = {role(9, 1, 1), role(5, 2, 2)};
	vyr_role_t b59[] = {role(5, 2, 2), role(9, 1, 1)};
	vyr_role_t b95r[] = {role(9, 1, 1), role(5, 2, 3)};
	vyr_role_t b95a[] = {role(9, 1, 1), role(5, 3, 2)};
	vyr_role_t b95pad[] = {role(9, 1, 1), role(5, 2, 2), role(1)};
	std::memset(reinterpret_cast<unsigned char *>(&b95pad[0]) + 13, 0x5A, 3);
	vyr_role_t *some = reinterpret_cast<vyr_role_t *>(0x10); // never followed

	struct Row {
		const char *what;
		vyrrl_t a, b;
		int expect;
	} rows[] = {
	    {"same entries", {2, 0, a95, nullptr, 1}, {2, 0, b95, nullptr, 7}, 1},
	    {"entries in other order", {2, 0, a95, nullptr, 1}, {2, 0, b59, nullptr, 1}, 0},
	    {"rights differ", {2, 0, a95, nullptr, 1}, {2, 0, b95r, nullptr, 1}, 0},
	    {"attr differs", {2, 0, a95, nullptr, 1}, {2, 0, b95a, nullptr, 1}, 0},
	    {"entries behind the count and padding ignored", {2, 0, a95, nullptr, 1}, {2, 0, b95pad, nullptr, 1}, 1},
	    {"counts differ", {2, 0, a95, nullptr, 1}, {1, 0, b95, nullptr, 1}, 0},
	    {"count 0, one list NULL", {0, 0, nullptr, nullptr, 1}, {0, 0, some, nullptr, 1}, 0},
	    {"count 0, both lists set", {0, 0, some, nullptr, 1}, {0, 0, some + 1, nullptr, 1}, 1},
	    {"second list: order", {0, 2, nullptr, a95, 1}, {0, 2, nullptr, b59, 1}, 0},
	    {"second list: count 0, one NULL", {0, 0, nullptr, some, 1}, {0, 0, nullptr, nullptr, 1}, 0},
	    {"same first pointer, second differs", {2, 1, a95, a95, 1}, {2, 1, a95, b59, 1}, 0},
	};
	for (const Row &row : rows) {
		EXPECT_EQ(vyrrl_cmp(&row.a, &row.b, 0), row.expect) << row.what;
		EXPECT_EQ(vyrrl_cmp(&row.b, &row.a, 0xFFFFFFFFu), row.expect) << row.what << " (third argument)";
	}
}

TEST(LabelEquality, WholeLabels)
{
	Label a{rich_label()};
	Label b{rich_label()};
	EXPECT_EQ(vyrl_cmp(a.get(), b.get(), 0), 1);
	b->rl->roles2[1].attr ^= 1;
	EXPECT_EQ(vyrl_cmp(a.get(), b.get(), 0), 0) << "equal ml, different roles";
	b->rl->roles2[1].attr ^= 1;
	b->ml->blob[2] ^= 0xFF;
	EXPECT_EQ(vyrl_cmp(a.get(), b.get(), 0), 0) << "different blob, equal roles";
}

// ---- Not-greater order -------------------------------------------------------------

TEST(LabelOrder, NotGreater)
{
	struct Row {
		vyrml_t a, b;
		int a_b, b_a;
	} rows[] = {
	    {part(3, 3, 5), part(3, 3, 5), 0, 0},
	    {part(0, 0, 1), part(0, 0, 2), -13, -13},
	    {part(100, 0, 0), part(200, 0, 0), 0, -13},
	    {part(0, 100, 0), part(0, 200, 0), 0, -13},
	    {part(1, 5, 0x1), part(2, 2, 0x3), -13, -13},
	    {part(0, 0, uint64_t{1} << 63), part(0, 0, UINT64_MAX), 0, -13},
	    {part(1, 1, 1, 7), part(1, 1, 1, 0), 0, 0}, // type plays no part
	};
	for (const Row &row : rows) {
		EXPECT_EQ(vyrml_notg(&row.a, &row.b), row.a_b) << int{row.a.lev} << "/" << int{row.a.ilev} << "/" << row.a.cat;
		EXPECT_EQ(vyrml_notg(&row.b, &row.a), row.b_a) << int{row.a.lev} << "/" << int{row.a.ilev} << "/" << row.a.cat;
	}
}

// ---- Child and parent -------------------------------------------------------------------

TEST(LabelChildParent, Table)
{
	struct Row {
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
	for (const Row &row : rows) {
		for (uint16_t t = 0; t < 4; ++t) {
			vyrml_t parent = row.parent;
			parent.type = t;
			EXPECT_EQ(vyrml_child_parent(&row.child, &parent), row.by_type[t]) << row.what << ", parent type " << t;
			// ehole and the upper bits change nothing; the child's type isn't read.
			parent.type = static_cast<uint16_t>(t | VYR_TYPE_EHOLE | 0xFF00);
			vyrml_t child = row.child;
			child.type = 0xFFFF;
			EXPECT_EQ(vyrml_child_parent(&child, &parent), row.by_type[t]) << row.what << ", parent type " << (t | 4);
		}
	}
}

// The label forms of the relations and of the mandatory decision look at
// the mandatory parts alone, subject or child first.
TEST(LabelRelations, LabelFormsIgnoreTypeBlobAndRoles)
{
	Label child{rich_label()}; // (3, 2, 0x55, 1) with blob and roles
	Label parent{vyrl_get_new_init_mac(3, 2, 0x55, 0)};
	EXPECT_EQ(vyrl_notg(child.get(), parent.get()), 0);
	EXPECT_EQ(vyr_child_parent(child.get(), parent.get()), 0);
	vyrl_set_lev(child.get(), 2);
	EXPECT_EQ(vyrl_notg(parent.get(), child.get()), -13);
	EXPECT_EQ(vyr_child_parent(child.get(), parent.get()), -13) << "lower lev needs the parent's ccnr";
	EXPECT_EQ(vyrl_permission(child.get(), parent.get(), VYR_REQ_READ), -1);
	EXPECT_EQ(vyrl_permission(parent.get(), child.get(), VYR_REQ_READ), 0);
	vyrl_set_type(parent.get(), VYR_TYPE_CCNR);
	EXPECT_EQ(vyr_child_parent(child.get(), parent.get()), 0);
}

} // namespace
