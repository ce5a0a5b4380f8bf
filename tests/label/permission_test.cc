// Permission decisions.
#include "label_test_util.hh"

#include <string>

using namespace label_test;

namespace {

constexpr int R = VYR_REQ_READ, W = VYR_REQ_WRITE, X = VYR_REQ_EXEC, WU = VYR_REQ_WRITE_UP;
constexpr int CHILD = VYR_REQ_CHILD, OBJ = VYR_REQ_OBJ_TYPE;
constexpr int NO_LEV = VYR_REQ_NO_LEV, NO_CAT = VYR_REQ_NO_CAT, NO_ILEV = VYR_REQ_NO_ILEV;

// Bits that carry no meaning in any decision.
constexpr int kMeaningless[] = {0x20, 0x40, 0x80, 0x100, 0x4000, 0x80000, static_cast<int>(0x80000000u)};

vyrml_t part(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type = 0)
{
	vyrml_t m{};
	m.lev = lev;
	m.ilev = ilev;
	m.cat = cat;
	m.type = type;
	m.ucnt = 1;
	return m;
}

TEST(FieldPermission, Level)
{
	struct Row {
		int s, o, req, expect;
	} rows[] = {
	    {1, 1, 0, 0},        {0, 255, 0, 0},         {2, 1, R, 0},          {1, 2, R, -1},
	    {200, 100, R, 0},    {100, 200, R, -1},      {2, 2, W, 0},          {2, 1, W, -1},
	    {1, 2, W, -1},       {2, 1, X, 0},           {1, 2, X, -1},         {1, 2, WU, 0},
	    {2, 1, WU, -1},      {2, 2, R | WU, 0},      {2, 1, R | WU, -1},    {1, 2, R | WU, -1},
	    {1, 2, R | NO_LEV, 0}, {1, 2, W | NO_LEV, 0}, {2, 1, W | WU, -1},   {0x101, 2, R, -1},
	    {0x102, 1, W, -1},   {0x301, 1, W, 0},       {-1, 255, W, 0},       {255, 0x1FF, W, 0},
	};
	for (const Row &row : rows) {
		EXPECT_EQ(vyr_lev_permission(row.s, row.o, row.req), row.expect)
		    << row.s << " vs " << row.o << " req " << row.req;
		for (int bit : kMeaningless)
			EXPECT_EQ(vyr_lev_permission(row.s, row.o, row.req | bit), row.expect) << "extra bit " << bit;
	}
}

TEST(FieldPermission, Categories)
{
	struct Row {
		uint64_t s, o;
		int req, expect;
	} rows[] = {
	    {0, UINT64_MAX, 0, 0}, {7, 3, R, 0},        {3, 7, R, -1},  {7, 3, X, 0},
	    {3, 7, X, -1},         {7, 7, W, 0},        {7, 3, W, -1},  {3, 7, W, -1},
	    {3, 7, WU, 0},         {7, 3, WU, -1},      {1, 2, WU, -1}, {1, 2, R, -1},
	    {5, 5, R | WU, 0},     {7, 3, R | WU, -1},  {3, 7, R | WU, -1},
	    {1, 2, R | W | X | WU | NO_CAT, 0},
	    {uint64_t{1} << 63, uint64_t{1} << 63, W, 0},
	};
	for (const Row &row : rows) {
		EXPECT_EQ(vyr_cat_permission(row.s, row.o, row.req), row.expect)
		    << row.s << " vs " << row.o << " req " << row.req;
		for (int bit : kMeaningless)
			EXPECT_EQ(vyr_cat_permission(row.s, row.o, row.req | bit), row.expect) << "extra bit " << bit;
	}
}

TEST(FieldPermission, Integrity)
{
	struct Row {
		int s, o, req, expect;
	} rows[] = {
	    {1, 3, R | X, 0},  {1, 3, 0, 0},      {3, 1, W, 0},     {1, 3, W, -1},     {3, 3, W, 0},
	    {3, 1, WU, 0},     {1, 3, WU, -1},    {1, 3, W | NO_ILEV, 0}, {200, 100, W, 0}, {100, 200, WU, -1},
	    {0x103, 2, W, 0},  {0x101, 2, W, -1}, {1, 3, W | NO_LEV | NO_CAT, -1},
	};
	for (const Row &row : rows) {
		EXPECT_EQ(vyr_ilev_permission(row.s, row.o, row.req), row.expect)
		    << row.s << " vs " << row.o << " req " << row.req;
		for (int bit : kMeaningless)
			EXPECT_EQ(vyr_ilev_permission(row.s, row.o, row.req | bit), row.expect) << "extra bit " << bit;
	}
}

TEST(FieldPermission, ConfidentialityNeedsLevelAndCategories)
{
	const vyrml_t s = part(2, 0, 1), o = part(1, 9, 3);
	EXPECT_EQ(vyrml_conf_permission(&s, &o, R), -1) << "categories deny";
	EXPECT_EQ(vyrml_conf_permission(&s, &o, R | NO_CAT), 0);
	EXPECT_EQ(vyrml_conf_permission(&o, &s, R | NO_CAT), -1) << "level denies";
	EXPECT_EQ(vyrml_conf_permission(&o, &s, R | NO_LEV), 0);
	EXPECT_EQ(vyrml_conf_permission(&s, &o, W | NO_LEV | NO_CAT), 0) << "no integrity test here";
}

// ---- Mandatory decision -----------------------------------------------------------

struct Worked {
	vyrml_t subject, object;
	int request, expect;
	const char *why;
};

const Worked kWorked[] = {
    {part(2, 1, 7), part(1, 1, 3, 0), R, 0, "read down"},
    {part(2, 1, 7), part(1, 1, 3, 0), X, 0, "execute down"},
    {part(2, 1, 7), part(1, 1, 3, 0), W, -1, "levels differ"},
    {part(2, 1, 7), part(1, 1, 3, 0), WU, -1, "level above"},
    {part(2, 1, 7), part(1, 1, 3, 0), W | NO_LEV, -1, "categories differ"},
    {part(2, 1, 7), part(1, 1, 3, 0), W | NO_LEV | NO_CAT, 0, "integrity levels equal"},
    {part(2, 1, 7), part(1, 1, 3, 0), 0, 0, "no bits"},
    {part(1, 0, 3), part(2, 1, 7, 0), R, -1, "level below"},
    {part(1, 0, 3), part(2, 1, 7, 0), WU, -1, "integrity below"},
    {part(1, 0, 3), part(2, 1, 7, 0), WU | NO_ILEV, 0, "integrity switched off"},
    {part(1, 0, 1), part(2, 1, 3, 1), R, -1, "ccnr not applied"},
    {part(1, 0, 1), part(2, 1, 3, 1), R | OBJ, 0, "ccnr applied"},
    {part(1, 0, 1), part(2, 1, 3, 1), W | OBJ, -1, "write demand stays"},
    {part(1, 0, 1), part(2, 1, 3, 2), W | NO_LEV | NO_CAT | OBJ, 0, "ccnri applied"},
    {part(1, 0, 1), part(2, 1, 3, 2), W | NO_LEV | NO_CAT, -1, "integrity below"},
    {part(1, 0, 1), part(2, 1, 3, 3), R | CHILD | OBJ, 0, "child test passes"},
    {part(1, 0, 1), part(2, 1, 3, 1), R | CHILD | OBJ, -1, "child test"},
    {part(1, 0, 1), part(2, 1, 3, 1), R | CHILD, -1, "level below, no child test"},
    {part(1, 0, 1), part(2, 1, 3, 4), W, 0, "ehole"},
    {part(3, 0, 0), part(1, 0, 0, 4), CHILD | OBJ, -1, "child test before ehole"},
    // Further cases around the same rules.
    {part(1, 0, 1), part(2, 1, 3, 1), X | OBJ, 0, "ccnr lifts execute as well"},
    {part(1, 0, 1), part(2, 1, 3, 1), WU | OBJ, -1, "ccnr leaves write-up: integrity below"},
    {part(1, 0, 1), part(2, 1, 3, 3), WU | OBJ, 0, "ccnr+ccnri: write-up passes"},
    {part(3, 0, 0), part(1, 0, 0, 4), CHILD, 0, "CHILD alone runs no child test"},
    {part(3, 0, 0), part(1, 0, 0, 4), OBJ | R | W | X | WU, 0, "ehole with OBJ"},
    {part(3, 3, 3), part(3, 1, 3), W, 0, "write: equal lev/cat, ilev above"},
    {part(3, 1, 3), part(3, 3, 3), W, -1, "write: ilev below"},
    {part(2, 2, 5), part(2, 2, 5), R | WU, 0, "read and write-up: equal"},
    {part(3, 2, 5), part(2, 2, 5), R | WU, -1, "read and write-up: level differs"},
    {part(2, 2, 7), part(2, 2, 5), R | WU, -1, "read and write-up: cats differ"},
    {part(200, 0, 0), part(100, 0, 0), R, 0, "unsigned levels"},
    {part(0, 0, 0), part(5, 5, 5, 1), R | NO_LEV, -1, "NO_LEV keeps the category test"},
    {part(0, 0, 5), part(5, 5, 5), W | NO_LEV | NO_CAT, -1, "neither switch lifts integrity"},
};

TEST(MandatoryPermission, WorkedExamples)
{
	for (const Worked &w : kWorked) {
		EXPECT_EQ(vyrml_permission(&w.subject, &w.object, w.request), w.expect) << w.why;
		for (int bit : kMeaningless)
			EXPECT_EQ(vyrml_permission(&w.subject, &w.object, w.request | bit), w.expect)
			    << w.why << ", extra bit " << bit;
	}
}

TEST(MandatoryPermission, LabelFormIgnoresRoles)
{
	const vyr_role_t mine[] = {role(5, 0, 0xF)};
	for (const Worked &w : kWorked) {
		const vyrml_t &s = w.subject, &o = w.object;
		Label sl{vyrl_get_new_init_mac_roles(s.lev, s.ilev, s.cat, s.type, mine, 1, nullptr, 0)};
		Label ol{vyrl_get_new_init_mac(o.lev, o.ilev, o.cat, o.type)};
		EXPECT_EQ(vyrl_permission(sl.get(), ol.get(), w.request), w.expect) << w.why;
	}
}

TEST(MandatoryPermission, EmptyRequestPassesEveryFieldTest)
{
	const vyrml_t low = part(0, 0, 0), high = part(255, 255, UINT64_MAX);
	EXPECT_EQ(vyrml_permission(&low, &high, 0), 0);
	EXPECT_EQ(vyrml_permission(&high, &low, 0), 0);
	EXPECT_EQ(vyrml_conf_permission(&low, &high, 0), 0);
	EXPECT_EQ(vyrml_conf_permission(&high, &low, 0), 0);
}

// ---- Role decision ------------------------------------------------------------------

struct RoleRow {
	std::vector<vyr_role_t> subject, object;
	int request, expect;
	const char *why;
};

TEST(RolePermission, MergePass)
{
	const std::vector<vyr_role_t> s952 = {role(9, 0, 0), role(5, 0, 0), role(2, 0, 0)};
	const std::vector<vyr_role_t> o751 = {role(7, 0, 0xF), role(5, 0, 6), role(1, 0, 0xF)};
	const RoleRow rows[] = {
	    {s952, o751, R | W, 0, "object's rights hold both bits"},
	    {s952, o751, R | X, -1, "execute right missing"},
	    {s952, o751, 0, 0, "an empty mask needs a common id"},
	    {s952, o751, W | 0x10 | 0x80, 0, "bits above the low four don't count"},
	    {s952, {role(7, 0, 0xF), role(1, 0, 0xF)}, 0, -1, "no common id"},
	    {{}, o751, 0, -1, "empty subject"},
	    {s952, {}, 0, -1, "empty object"},
	    {{role(5, 0, 0xF)}, {role(5, 0, 0xF0)}, 0, 0, "rights above the low four are never demanded"},
	    {{role(5, 0, 0xF)}, {role(5, 0, 0xF0)}, X, -1, "subject's rights don't matter"},
	    {{role(5, 0, 0)}, {role(5, 0, 8)}, WU, 0, "subject entry with rights 0"},
	    {{role(UINT64_MAX), role(0)}, {role(uint64_t{1} << 63), role(0, 0, 1)}, X, 0, "unsigned ids"},
	    {{role(UINT64_MAX)}, {role(UINT64_MAX, 0, 4)}, R, 0, "all-ones id"},
	    {{role(9), role(3)}, {role(8), role(7), role(6), role(3, 0, 2)}, W, 0, "object walks past larger ids"},
	    {{role(9), role(8), role(7), role(3)}, {role(3, 0, 2)}, W, 0, "subject walks past larger ids"},
	    {{role(3)}, {role(9), role(8)}, 0, -1, "object list used up"},
	    // Unsorted lists are walked as they are and can miss a common id.
	    {{role(2), role(9)}, {role(9, 0, 0xF)}, 0, -1, "subject out of order: 9 passed over"},
	    {{role(9), role(2)}, {role(2), role(9, 0, 0xF)}, X, -1, "object out of order: 9 never reached"},
	    {{role(9), role(2)}, {role(2), role(9, 0, 0xF)}, 0, 0, "out of order, 2 still met"},
	};
	for (const RoleRow &row : rows) {
		EXPECT_EQ(vyr_roles_permission(row.subject.data(), static_cast<uint32_t>(row.subject.size()),
		                               row.object.data(), static_cast<uint32_t>(row.object.size()), row.request),
		          row.expect)
		    << row.why;
	}
}

TEST(RolePermission, ZeroCountsAreNotFollowed)
{
	const vyr_role_t *bad = reinterpret_cast<const vyr_role_t *>(0x8);
	const vyr_role_t one[] = {role(1, 0, 0xF)};
	EXPECT_EQ(vyr_roles_permission(bad, 0, one, 1, 0), -1);
	EXPECT_EQ(vyr_roles_permission(one, 1, bad, 0, 0), -1);
	EXPECT_EQ(vyr_roles_permission(nullptr, 0, nullptr, 0, 0), -1);
}

TEST(RolePermission, EitherListPairGrantsButListsNeverCross)
{
	auto rl = [](std::vector<vyr_role_t> r1, std::vector<vyr_role_t> r2) {
		return Rl{vyrrl_get_new_init_roles(r1.data(), static_cast<uint32_t>(r1.size()), r2.data(),
		                                   static_cast<uint32_t>(r2.size()))};
	};
	struct Row {
		Rl subject, object;
		int request, expect;
		const char *why;
	} rows[] = {
	    {rl({role(4)}, {}), rl({}, {role(4, 0, 0xF)}), 0, -1, "subject roles1 meets no object roles2"},
	    {rl({}, {role(4)}), rl({role(4, 0, 0xF)}, {}), 0, -1, "subject roles2 meets no object roles1"},
	    {rl({role(4)}, {role(6)}), rl({role(5)}, {role(6, 0, 2)}), W, 0, "second pair grants"},
	    {rl({}, {role(6)}), rl({role(6, 0, 2)}, {role(6, 0, 2)}), W, 0, "first pair empty on one side"},
	    {rl({role(6)}, {role(6)}), rl({role(6, 0, 1)}, {role(6, 0, 2)}), W, 0, "first pair lacks the right"},
	    {rl({role(6)}, {}), rl({role(6, 0, 2)}, {}), W, 0, "first pair grants"},
	    {rl({role(6)}, {role(6)}), rl({role(6, 0, 1)}, {role(6, 0, 1)}), W, -1, "neither pair has the right"},
	};
	for (const Row &row : rows)
		EXPECT_EQ(vyrrl_permission(row.subject.get(), row.object.get(), row.request), row.expect) << row.why;
}

} // namespace
