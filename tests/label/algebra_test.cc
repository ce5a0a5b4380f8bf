// Field access, label algebra, and replacing a held reference.
#include "label_test_util.hh"

#include <cerrno>

using namespace label_test;

namespace {

Label make(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type) { return Label{vyrl_get_new_init_mac(lev, ilev, cat, type)}; }

// lev, ilev, cat, type
using Fields = std::tuple<int, int, uint64_t, int>;
Fields fields(const vyrl_t *l) { return {vyrl_lev(l), vyrl_ilev(l), vyrl_cat(l), vyrl_type(l)}; }

// Every one-field operation on (100, 100, 0xF0, 0x0F), read through a second
// label sharing the mandatory part: changes are made in place, to that field
// alone.  Levels compare unsigned (200 > 100, 128 > 100).
TEST(LabelAlgebra, OneFieldOperations)
{
#define OP(f, v) #f "(" #v ")", [](vyrl_t *l) { vyrl_##f(l, v); }
	const struct {
		const char *what;
		void (*op)(vyrl_t *);
		Fields expect;
	} rows[] = {
	    {OP(set_lev, 200), {200, 100, 0xF0, 0x0F}},          {OP(set_ilev, 7), {100, 7, 0xF0, 0x0F}},
	    {OP(set_cat, UINT64_MAX), {100, 100, UINT64_MAX, 0x0F}}, {OP(set_type, 0x8001), {100, 100, 0xF0, 0x8001}},
	    {OP(and_cat, 0x3C), {100, 100, 0x30, 0x0F}},          {OP(subtract_cat, 0x1F), {100, 100, 0xE0, 0x0F}},
	    {OP(or_cat, uint64_t{1} << 63), {100, 100, 0x80000000000000F0, 0x0F}},
	    {OP(and_type, 0x3C), {100, 100, 0xF0, 0x0C}},         {OP(or_type, 0x8000), {100, 100, 0xF0, 0x800F}},
	    {OP(subtract_type, 0x3), {100, 100, 0xF0, 0x0C}},     {OP(maximize_lev, 200), {200, 100, 0xF0, 0x0F}},
	    {OP(maximize_lev, 50), {100, 100, 0xF0, 0x0F}},       {OP(minimize_lev, 50), {50, 100, 0xF0, 0x0F}},
	    {OP(minimize_lev, 200), {100, 100, 0xF0, 0x0F}},      {OP(maximize_ilev, 255), {100, 255, 0xF0, 0x0F}},
	    {OP(minimize_ilev, 128), {100, 100, 0xF0, 0x0F}},
	};
#undef OP
	for (const auto &row : rows) {
		Label l{rich_label()};
		vyrl_set_lev(l.get(), 100), vyrl_set_ilev(l.get(), 100), vyrl_set_cat(l.get(), 0xF0), vyrl_set_type(l.get(), 0x0F);
		Label sharer{vyrl_get_new_init_mr(vyrml_get(l->ml), nullptr)};
		row.op(l.get());
		EXPECT_EQ(fields(sharer.get()), row.expect) << row.what;
		EXPECT_EQ(l->ml->blob_size + vyrml_ucnt(l->ml), 3u + 2u) << row.what;
	}
}

TEST(LabelAlgebra, UniteAndSubtract)
{
	Label a = make(1, 2, 3, 1), b = make(2, 1, 4, 2), c = make(1, 2, 3, 1), s = make(200, 130, 0xFF, 7);
	EXPECT_EQ(vyrl_unite(a.get(), b.get()), a.get());
	EXPECT_EQ(fields(a.get()), (Fields{2, 2, 7, 3}));
	EXPECT_EQ(fields(b.get()), (Fields{2, 1, 4, 2})) << "the second is only read";
	EXPECT_EQ(vyrl_subtract(c.get(), b.get()), c.get());
	EXPECT_EQ(fields(c.get()), (Fields{1, 1, 3, 1})) << "minimum of levels, bit difference of cat and type";
	vyrl_subtract(s.get(), s.get());
	EXPECT_EQ(fields(s.get()), (Fields{200, 130, 0, 0}));
}

// The three replacing operations report a self-copy each in its own way, and
// copy or drop nothing then.
TEST(LabelReplace, SelfCopyResultsDiffer)
{
	Label l = make(1, 2, 3, 4);
	vyrl_t *held = l.get();
	vyrml_t *m = l->ml;
	vyrrl_t *r = l->rl;
	errno = 0;
	EXPECT_EQ(vyrl_upd(&held, held), nullptr);
	EXPECT_EQ(errno, EINVAL);
	errno = 0;
	EXPECT_EQ(vyrml_own_cpy(&m, m), 22);
	EXPECT_EQ(errno, 0) << "vyrml_own_cpy reports, it doesn't set errno";
	EXPECT_EQ(vyrrl_own_cpy(&r, r), 0);
	EXPECT_TRUE(held == l.get() && m == l->ml && r == l->rl);
	EXPECT_EQ(counts(l.get()), Counts(1, 1, 1));
}

// Each replacing operation leaves the caller a private copy of the source and
// drops the old reference, which other holders keep.  The copy is made first,
// so a failed copy costs nothing: *dst keeps its record and its reference.
TEST(LabelReplaceAllocFailure, HeldRecordIsReplacedOrKept)
{
	Label src{rich_label()}, old = make(1, 1, 1, 1);
	long attempts = vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		vyrl_t *held = vyrl_get(old.get());
		vyrml_t *m = vyrml_get(old->ml);
		vyrrl_t *r = vyrrl_get(old->rl);
		vyrl_t *upd = nullptr;
		int ml = -99, rl = -99; // the first failure stops the rest, so each is swept through
		inj.run([&] {
			if ((upd = vyrl_upd(&held, src.get())) && (ml = vyrml_own_cpy(&m, src->ml)) == 0)
				rl = vyrrl_own_cpy(&r, src->rl);
		});
		if (!inj.fired()) {
			EXPECT_TRUE(upd == held && rl == 0);
			EXPECT_EQ(vyrl_cmp(held, src.get(), 0) + vyrml_cmp(m, src->ml) + vyrrl_cmp(r, src->rl, 0), 3);
			EXPECT_TRUE(held->ml != src->ml && m != src->ml && r != src->rl) << "private copies";
		} else if (!upd) {
			EXPECT_EQ(held, old.get());
		} else if (ml != 0) {
			EXPECT_TRUE(ml == ENOMEM && m == old->ml);
		} else {
			EXPECT_TRUE(rl == -1 && r == old->rl);
		}
		vyrl_put(held);
		vyrml_put(m);
		vyrrl_put(r);
		EXPECT_EQ(counts(old.get()), Counts(1, 1, 1));
	});
	EXPECT_EQ(attempts, 6 + 2 + 3 + 1);
}

} // namespace
