// Equality, the not-greater order and the child/parent relation.
#include "label_test_util.hh"

using namespace label_test;

namespace {

// A stack vyrml_t with its padding bytes filled with `pad`.
vyrml_t part(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type = 0, unsigned char pad = 0)
{
	vyrml_t m;
	std::memset(&m, pad, sizeof m);
	m.lev = lev;
	m.ilev = ilev;
	m.cat = cat;
	m.type = type;
	m.blob_size = 0;
	m.blob = nullptr;
	m.ucnt = 1;
	return m;
}

TEST(LabelEquality, MandatoryParts)
{
	unsigned char bytes_a[] = {1, 2, 3}, bytes_b[] = {1, 2, 3}, bytes_c[] = {1, 2, 4};
	vyrml_t base = part(1, 2, 3, 4, 0x00);
	base.blob = bytes_a;
	base.blob_size = 3;

	struct Row {
		const char *what;
		void (*change)(vyrml_t &, unsigned char *, unsigned char *);
		int expect;
	} rows[] = {
	    {"padding, ucnt and blob address differ", [](vyrml_t &m, unsigned char *same, unsigned char *) {
		     std::memset(reinterpret_cast<unsigned char *>(&m) + 2, 0xEE, 6);
		     m.ucnt = 9;
		     m.blob = same;
	     },
	     1},
	    {"one blob byte", [](vyrml_t &m, unsigned char *, unsigned char *other) { m.blob = other; }, 0},
	    {"blob_size", [](vyrml_t &m, unsigned char *, unsigned char *) { m.blob_size = 2; }, 0},
	    {"lev", [](vyrml_t &m, unsigned char *, unsigned char *) { m.lev = 201; }, 0},
	    {"ilev", [](vyrml_t &m, unsigned char *, unsigned char *) { m.ilev = 0; }, 0},
	    {"cat high bit", [](vyrml_t &m, unsigned char *, unsigned char *) { m.cat |= uint64_t{1} << 63; }, 0},
	    {"type high bit", [](vyrml_t &m, unsigned char *, unsigned char *) { m.type |= 0x8000; }, 0},
	};
	for (const Row &row : rows) {
		vyrml_t other = base;
		row.change(other, bytes_b, bytes_c);
		EXPECT_EQ(vyrml_cmp(&base, &other), row.expect) << row.what;
		EXPECT_EQ(vyrml_cmp(&other, &base), row.expect) << row.what;
	}
}

TEST(LabelEquality, SelfComparisonReadsNoField)
{
	// Following these records' pointers would crash: blob and roles1 are
	// NULL under non-zero sizes.
	vyrml_t m = part(1, 1, 1);
	m.blob_size = 5;
	vyrrl_t r{};
	r.nroles1 = 4;
	r.roles1 = reinterpret_cast<vyr_role_t *>(0x8);
	vyr_role_t *bad_role = reinterpret_cast<vyr_role_t *>(0x8);
	EXPECT_EQ(vyrml_cmp(&m, &m), 1);
	EXPECT_EQ(vyrrl_cmp(&r, &r, 0), 1);
	EXPECT_EQ(vyr_role_cmp(bad_role, bad_role), 1);
	vyrl_t l{&m, &r, 1};
	EXPECT_EQ(vyrl_cmp(&l, &l, 0), 1);
	// Two labels sharing both parts: equal without reading the parts.
	vyrl_t twin{&m, &r, 1};
	EXPECT_EQ(vyrl_cmp(&l, &twin, 0), 1);
}

TEST(LabelEquality, RoleParts)
{
	vyr_role_t a95[] = {role(9, 1, 1), role(5, 2, 2)};
	vyr_role_t b95[] = {role(9, 1, 1), role(5, 2, 2)};
	vyr_role_t b59[] = {role(5, 2, 2), role(9, 1, 1)};
	vyr_role_t b95r[] = {role(9, 1, 1), role(5, 2, 3)};
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
	    {"entries behind the count and padding ignored", {2, 0, a95, nullptr, 1}, {2, 0, b95pad, nullptr, 1}, 1},
	    {"counts differ", {2, 0, a95, nullptr, 1}, {1, 0, b95, nullptr, 1}, 0},
	    {"count 0, one list NULL", {0, 0, nullptr, nullptr, 1}, {0, 0, some, nullptr, 1}, 0},
	    {"count 0, both lists set", {0, 0, some, nullptr, 1}, {0, 0, some + 1, nullptr, 1}, 1},
	    {"second list: same entries", {0, 2, nullptr, a95, 1}, {0, 2, nullptr, b95, 1}, 1},
	    {"second list: order", {0, 2, nullptr, a95, 1}, {0, 2, nullptr, b59, 1}, 0},
	    {"second list: count 0, one NULL", {0, 0, nullptr, some, 1}, {0, 0, nullptr, nullptr, 1}, 0},
	    {"second list count differs", {0, 1, nullptr, a95, 1}, {0, 2, nullptr, a95, 1}, 0},
	    {"same first pointer, second differs", {2, 1, a95, a95, 1}, {2, 1, a95, b59, 1}, 0},
	};
	for (const Row &row : rows) {
		EXPECT_EQ(vyrrl_cmp(&row.a, &row.b, 0), row.expect) << row.what;
		EXPECT_EQ(vyrrl_cmp(&row.b, &row.a, 0), row.expect) << row.what;
		EXPECT_EQ(vyrrl_cmp(&row.a, &row.b, 0xFFFFFFFFu), row.expect) << row.what << " (third argument)";
	}
}

TEST(LabelEquality, WholeLabels)
{
	Label a{rich_label()};
	Label b{rich_label()};
	EXPECT_EQ(vyrl_cmp(a.get(), b.get(), 0), 1);
	EXPECT_EQ(vyrl_cmp(a.get(), b.get(), 12345), 1);
	b->rl->roles2[1].attr ^= 1;
	EXPECT_EQ(vyrl_cmp(a.get(), b.get(), 0), 0) << "equal ml, different roles";
	EXPECT_EQ(vyrl_cmp(a.get(), b.get(), 7), 0);
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
	    {part(1, 1, 0x1), part(2, 2, 0x3), 0, -13},
	    {part(1, 5, 0x1), part(2, 2, 0x3), -13, -13},
	    {part(0, 0, uint64_t{1} << 63), part(0, 0, UINT64_MAX), 0, -13},
	    // type plays no part
	    {part(1, 1, 1, 7), part(1, 1, 1, 0), 0, 0},
	};
	for (const Row &row : rows) {
		EXPECT_EQ(vyrml_notg(&row.a, &row.b), row.a_b)
		    << int{row.a.lev} << "/" << int{row.a.ilev} << "/" << row.a.cat;
		EXPECT_EQ(vyrml_notg(&row.b, &row.a), row.b_a)
		    << int{row.a.lev} << "/" << int{row.a.ilev} << "/" << row.a.cat;
	}
}

TEST(LabelOrder, LabelFormIgnoresTypeBlobAndRoles)
{
	Label a{rich_label()};
	Label b = Label{vyrl_get_new_init_mac(3, 2, 0x55, 0xFFFF)};
	EXPECT_EQ(vyrl_notg(a.get(), b.get()), 0);
	EXPECT_EQ(vyrl_notg(b.get(), a.get()), 0);
	vyrl_set_ilev(b.get(), 1);
	EXPECT_EQ(vyrl_notg(a.get(), b.get()), -13);
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
			EXPECT_EQ(vyrml_child_parent(&row.child, &parent), row.by_type[t])
			    << row.what << ", parent type " << t;
			// ehole and the upper bits change nothing; the child's type isn't read.
			parent.type = static_cast<uint16_t>(t | VYR_TYPE_EHOLE | 0xFF00);
			vyrml_t child = row.child;
			child.type = 0xFFFF;
			EXPECT_EQ(vyrml_child_parent(&child, &parent), row.by_type[t])
			    << row.what << ", parent type " << (t | 4);
		}
	}
}

TEST(LabelChildParent, LabelFormIgnoresRoles)
{
	Label child{rich_label()};
	Label parent{vyrl_get_new_init_mac(3, 2, 0x55, 0)};
	EXPECT_EQ(vyr_child_parent(child.get(), parent.get()), 0);
	vyrl_set_lev(child.get(), 2);
	EXPECT_EQ(vyr_child_parent(child.get(), parent.get()), -13);
	vyrl_set_type(parent.get(), VYR_TYPE_CCNR);
	EXPECT_EQ(vyr_child_parent(child.get(), parent.get()), 0);
}

} // namespace
