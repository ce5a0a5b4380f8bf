// Permission decisions.
#include "label_test_util.hh"

using namespace label_test;

static_assert(VYR_REQ_EXEC == 1 && VYR_REQ_WRITE == 2 && VYR_REQ_READ == 4 && VYR_REQ_WRITE_UP == 8);
static_assert(VYR_REQ_CHILD == 0x10 && VYR_REQ_OBJ_TYPE == 0x8000 && VYR_REQ_NO_LEV == 0x10000);
static_assert(VYR_REQ_NO_CAT == 0x20000 && VYR_REQ_NO_ILEV == 0x40000 && VYR_TYPE_CCNRA == 3 && VYR_TYPE_ALL == 7);

namespace {

constexpr int R = VYR_REQ_READ, W = VYR_REQ_WRITE, X = VYR_REQ_EXEC, WU = VYR_REQ_WRITE_UP;
constexpr int CHILD = VYR_REQ_CHILD, OBJ = VYR_REQ_OBJ_TYPE;
constexpr int NO_LEV = VYR_REQ_NO_LEV, NO_CAT = VYR_REQ_NO_CAT, NO_ILEV = VYR_REQ_NO_ILEV;

// Every row of the field and mandatory tables also runs with each meaningless bit added.
constexpr int kExtraBits[] = {0, 0x20, 0x80, 0x4000, 0x80000, static_cast<int>(0x80000000u)};

using FieldTest = int (*)(uint64_t subject, uint64_t object, int request);
int lev(uint64_t s, uint64_t o, int req) { return vyr_lev_permission(int(s), int(o), req); }
int ilev(uint64_t s, uint64_t o, int req) { return vyr_ilev_permission(int(s), int(o), req); }
const FieldTest cat = vyr_cat_permission;

TEST(FieldPermission, Table)
{
	const struct {
		FieldTest test;
		uint64_t s, o;
		int req, expect;
	} rows[] = {
	    {lev, 0, 255, 0, 0},     {lev, 200, 100, R, 0}, {lev, 100, 200, R, -1},   {lev, 2, 2, W, 0},
	    {lev, 2, 1, W, -1},      {lev, 1, 2, W, -1},    {lev, 2, 1, X, 0},        {lev, 1, 2, X, -1},
	    {lev, 1, 2, WU, 0},      {lev, 2, 1, WU, -1},   {lev, 2, 2, R | WU, 0},   {lev, 2, 1, R | WU, -1},
	    {lev, 1, 2, R | WU, -1}, {lev, 1, 2, R | NO_LEV, 0}, {lev, 1, 2, W | NO_LEV, 0},
	    {lev, 0x101, 2, R, -1},  {lev, 0x301, 1, W, 0}, // only the low 8 bits of a level count
	    {cat, 0, UINT64_MAX, 0, 0}, {cat, 7, 3, R, 0},  {cat, 3, 7, R, -1},       {cat, 7, 3, X, 0},
	    {cat, 3, 7, X, -1},      {cat, 7, 7, W, 0},     {cat, 7, 3, W, -1},       {cat, 3, 7, W, -1},
	    {cat, 3, 7, WU, 0},      {cat, 7, 3, WU, -1},   {cat, 5, 5, R | WU, 0},   {cat, 7, 3, R | WU, -1},
	    {cat, 3, 7, R | WU, -1}, {cat, 1, 2, R | W | X | WU | NO_CAT, 0},
	    // Only writing has an integrity test: both write bits ask for the subject at or above.
	    {ilev, 1, 3, R | X, 0},  {ilev, 3, 1, W, 0},    {ilev, 1, 3, W, -1},      {ilev, 3, 3, W, 0},
	    {ilev, 3, 1, WU, 0},     {ilev, 1, 3, WU, -1},  {ilev, 1, 3, W | NO_ILEV, 0},
	    {ilev, 200, 100, W, 0},  {ilev, 0x101, 2, W, -1}, {ilev, 1, 3, W | NO_LEV | NO_CAT, -1},
	};
	for (const auto &row : rows)
		for (int extra : kExtraBits)
			EXPECT_EQ(row.test(row.s, row.o, row.req | extra), row.expect) << "row " << (&row - rows) << " extra " << extra;
	const vyrml_t s = part(2, 0, 1), o = part(1, 9, 3); // confidentiality: level and categories, no integrity
	EXPECT_EQ(vyrml_conf_permission(&s, &o, R), -1) << "categories deny";
	EXPECT_EQ(vyrml_conf_permission(&o, &s, R | NO_CAT), -1) << "level denies";
	EXPECT_EQ(vyrml_conf_permission(&s, &o, R | NO_CAT) + vyrml_conf_permission(&s, &o, W | NO_LEV | NO_CAT), 0);
}

TEST(MandatoryPermission, WorkedExamples)
{
	const vyrml_t hi = part(2, 1, 7), lo = part(1, 1, 3), lo0 = part(1, 0, 3), s = part(1, 0, 1);
	const struct {
		vyrml_t subject, object;
		int request, expect;
		const char *why;
	} rows[] = {
	    {hi, lo, R, 0, "read down"},                 {hi, lo, X, 0, "execute down"},
	    {hi, lo, W, -1, "levels differ"},            {hi, lo, WU, -1, "level above"},
	    {hi, lo, W | NO_LEV, -1, "categories differ"}, {hi, lo, W | NO_LEV | NO_CAT, 0, "integrity levels equal"},
	    {hi, lo, 0, 0, "no bits"},                   {lo0, hi, R, -1, "level below"},
	    {lo0, hi, WU, -1, "integrity below"},        {lo0, hi, WU | NO_ILEV, 0, "integrity switched off"},
	    {s, part(2, 1, 3, 1), R, -1, "ccnr not applied"}, {s, part(2, 1, 3, 1), R | OBJ, 0, "ccnr applied"},
	    {s, part(2, 1, 3, 1), W | OBJ, -1, "write demand stays"},
	    {s, part(2, 1, 3, 2), W | NO_LEV | NO_CAT | OBJ, 0, "ccnri applied"},
	    {s, part(2, 1, 3, 2), W | NO_LEV | NO_CAT, -1, "integrity below"},
	    {s, part(2, 1, 3, 3), R | CHILD | OBJ, 0, "child test passes"},
	    {s, part(2, 1, 3, 1), R | CHILD | OBJ, -1, "child test"},
	    {s, part(2, 1, 3, 1), R | CHILD, -1, "level below, no child test"},
	    {s, part(2, 1, 3, 4), W, 0, "ehole"},        {part(3, 0, 0), part(1, 0, 0, 4), CHILD | OBJ, -1, "child test first"},
	    {s, part(2, 1, 3, 1), X | OBJ, 0, "ccnr lifts execute as well"},
	    {s, part(2, 1, 3, 1), WU | OBJ, -1, "ccnr leaves write-up: integrity below"},
	    {s, part(2, 1, 3, 3), WU | OBJ, 0, "ccnr+ccnri: write-up passes"},
	    {part(3, 0, 0), part(1, 0, 0, 4), CHILD, 0, "CHILD alone runs no child test"},
	    {part(3, 1, 3), part(3, 3, 3), W, -1, "write: ilev below"},
	    {part(2, 0, 1), part(2, 1, 3, 2), W | OBJ, -1, "ccnri leaves the category test"},
	};
	for (const auto &w : rows)
		for (int bit : kExtraBits)
			EXPECT_EQ(vyrml_permission(&w.subject, &w.object, w.request | bit), w.expect) << w.why << ", extra " << bit;
}

// One merge pass over lists in descending id order; the subject's rights aren't read.
TEST(RolePermission, MergePass)
{
	using V = std::vector<vyr_role_t>;
	const V s952 = {role(9), role(5), role(2)}, o751 = {role(7, 0, 0xF), role(5, 0, 6), role(1, 0, 0xF)};
	const struct {
		V subject, object;
		int request, expect;
		const char *why;
	} rows[] = {
	    {s952, o751, R | W, 0, "object's rights hold both bits"}, {s952, o751, R | X, -1, "execute right missing"},
	    {s952, o751, 0, 0, "an empty mask needs a common id"},
	    {s952, o751, W | 0x10 | 0x80, 0, "bits above the low four don't count"},
	    {s952, {role(7, 0, 0xF), role(1, 0, 0xF)}, 0, -1, "no common id"},
	    {{}, o751, 0, -1, "empty subject"}, {s952, {}, 0, -1, "empty object"},
	    {{role(5, 0, 0xF)}, {role(5, 0, 0xF0)}, X, -1, "subject's rights don't matter, nor high right bits"},
	    {{role(UINT64_MAX), role(0)}, {role(uint64_t{1} << 63), role(0, 0, 1)}, X, 0, "unsigned ids"},
	    {{role(9), role(3)}, {role(8), role(7), role(6), role(3, 0, 2)}, W, 0, "object walks past larger ids"},
	    {{role(9), role(8), role(7), role(3)}, {role(3, 0, 2)}, W, 0, "subject walks past larger ids"},
	    {{role(2), role(9)}, {role(9, 0, 0xF)}, 0, -1, "unsorted subject: 9 passed over"},
	    {{role(9), role(2)}, {role(2), role(9, 0, 0xF)}, X, -1, "unsorted object: 9 never reached"},
	};
	auto n = [](const V &v) { return static_cast<uint32_t>(v.size()); };
	for (const auto &row : rows)
		EXPECT_EQ(vyr_roles_permission(row.subject.data(), n(row.subject), row.object.data(), n(row.object), row.request),
		          row.expect) << row.why;
	const vyr_role_t *bad = reinterpret_cast<const vyr_role_t *>(0x8); // a count of 0: not followed
	EXPECT_EQ(vyr_roles_permission(bad, 0, o751.data(), 3, 0) + vyr_roles_permission(s952.data(), 3, bad, 0, 0), -2);

	// Either pair of lists may grant, and the lists are never crossed.
	auto rl = [&n](V a, V b) { return Rl{vyrrl_get_new_init_roles(a.data(), n(a), b.data(), n(b))}; };
	const struct {
		Rl subject, object;
		int request, expect;
	} pairs[] = {
	    {rl({role(4)}, {}), rl({}, {role(4, 0, 0xF)}), 0, -1}, {rl({}, {role(4)}), rl({role(4, 0, 0xF)}, {}), 0, -1},
	    {rl({}, {role(6)}), rl({role(6, 0, 2)}, {role(6, 0, 2)}), W, 0},
	    {rl({role(6)}, {role(6)}), rl({role(6, 0, 1)}, {role(6, 0, 2)}), W, 0}, // first pair lacks the right
	    {rl({role(6)}, {}), rl({role(6, 0, 2)}, {}), W, 0},
	};
	for (const auto &p : pairs)
		EXPECT_EQ(vyrrl_permission(p.subject.get(), p.object.get(), p.request), p.expect) << (&p - pairs);
}

} // namespace
