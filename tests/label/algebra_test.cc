// Field access and label algebra.
#include "label_test_util.hh"

#include <cerrno>
#include <tuple>

using namespace label_test;

namespace {

Label make(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type)
{
	return Label{vyrl_get_new_init_mac(lev, ilev, cat, type)};
}

// lev, ilev, cat, type
using Fields = std::tuple<int, int, uint64_t, int>;

Fields fields(const vyrl_t *l)
{
	return {vyrl_lev(l), vyrl_ilev(l), vyrl_cat(l), vyrl_type(l)};
}

// Every one-field operation on a label at (100, 100, 0xF0, 0x0F).  The
// result is read through a second label that shares the mandatory part:
// changes are made in place, and nothing but the field changes.
TEST(LabelAlgebra, OneFieldOperations)
{
	struct Row {
		const char *what;
		void (*op)(vyrl_t *);
		Fields expect;
	} rows[] = {
	    {"set_lev", [](vyrl_t *l) { vyrl_set_lev(l, 200); }, {200, 100, 0xF0, 0x0F}},
	    {"set_ilev", [](vyrl_t *l) { vyrl_set_ilev(l, 7); }, {100, 7, 0xF0, 0x0F}},
	    {"set_cat", [](vyrl_t *l) { vyrl_set_cat(l, UINT64_MAX); }, {100, 100, UINT64_MAX, 0x0F}},
	    {"set_type", [](vyrl_t *l) { vyrl_set_type(l, 0x8001); }, {100, 100, 0xF0, 0x8001}},
	    {"and_cat", [](vyrl_t *l) { vyrl_and_cat(l, 0x3C); }, {100, 100, 0x30, 0x0F}},
	    {"or_cat", [](vyrl_t *l) { vyrl_or_cat(l, uint64_t{1} << 63); }, {100, 100, 0x80000000000000F0, 0x0F}},
	    {"subtract_cat", [](vyrl_t *l) { vyrl_subtract_cat(l, 0x1F); }, {100, 100, 0xE0, 0x0F}},
	    {"and_type", [](vyrl_t *l) { vyrl_and_type(l, 0x3C); }, {100, 100, 0xF0, 0x0C}},
	    {"or_type", [](vyrl_t *l) { vyrl_or_type(l, 0x8000); }, {100, 100, 0xF0, 0x800F}},
	    {"subtract_type", [](vyrl_t *l) { vyrl_subtract_type(l, 0x3); }, {100, 100, 0xF0, 0x0C}},
	    {"subtract_type all", [](vyrl_t *l) { vyrl_subtract_type(l, 0xFFFF); }, {100, 100, 0xF0, 0}},
	    // Levels compare unsigned: 200 is above 100.
	    {"maximize_lev", [](vyrl_t *l) { vyrl_maximize_lev(l, 200); }, {200, 100, 0xF0, 0x0F}},
	    {"maximize_lev lower", [](vyrl_t *l) { vyrl_maximize_lev(l, 50); }, {100, 100, 0xF0, 0x0F}},
	    {"minimize_lev", [](vyrl_t *l) { vyrl_minimize_lev(l, 50); }, {50, 100, 0xF0, 0x0F}},
	    {"minimize_lev higher", [](vyrl_t *l) { vyrl_minimize_lev(l, 200); }, {100, 100, 0xF0, 0x0F}},
	    {"maximize_ilev", [](vyrl_t *l) { vyrl_maximize_ilev(l, 255); }, {100, 255, 0xF0, 0x0F}},
	    {"minimize_ilev", [](vyrl_t *l) { vyrl_minimize_ilev(l, 0); }, {100, 0, 0xF0, 0x0F}},
	    {"minimize_ilev higher", [](vyrl_t *l) { vyrl_minimize_ilev(l, 128); }, {100, 100, 0xF0, 0x0F}},
	};
	for (const Row &row : rows) {
		Label l = make(100, 100, 0xF0, 0x0F);
		l->ml->blob = heap_blob({1});
		l->ml->blob_size = 1;
		Label sharer{vyrl_get_new_init_mr(vyrml_get(l->ml), nullptr)};
		row.op(l.get());
		EXPECT_EQ(fields(sharer.get()), row.expect) << row.what;
		EXPECT_EQ(l->ml->blob_size, 1u) << row.what;
		EXPECT_EQ(vyrml_ucnt(l->ml), 2) << row.what;
	}
}

TEST(LabelAlgebra, LevelArithmeticIsUnsigned)
{
	EXPECT_EQ(vyr_lev_max(100, 200), 200);
	EXPECT_EQ(vyr_lev_min(200, 100), 100);
	EXPECT_EQ(vyr_ilev_max(127, 128), 128);
	EXPECT_EQ(vyr_ilev_min(200, 100), 100);
}

TEST(LabelAlgebra, UniteAndSubtract)
{
	Label a = make(1, 2, 3, 1);
	Label b = make(2, 1, 4, 2);
	EXPECT_EQ(vyrl_unite(a.get(), b.get()), a.get());
	EXPECT_EQ(fields(a.get()), (Fields{2, 2, 7, 3}));
	EXPECT_EQ(fields(b.get()), (Fields{2, 1, 4, 2})) << "the second is only read";

	Label c = make(1, 2, 3, 1);
	EXPECT_EQ(vyrl_subtract(c.get(), b.get()), c.get());
	EXPECT_EQ(fields(c.get()), (Fields{1, 1, 3, 1})) << "minimum of levels, bit difference of cat and type";

	Label s = make(200, 130, 0xFF, 7);
	vyrl_subtract(s.get(), s.get());
	EXPECT_EQ(fields(s.get()), (Fields{200, 130, 0, 0}));
}

// ---- Replacing a held reference ---------------------------------------------------

// The three replacing operations report a self-copy each in its own way, and
// none of them copies or drops anything then.
TEST(LabelReplace, SelfCopyResultsDiffer)
{
	Label l = make(1, 2, 3, 4);
	vyrl_t *held = l.get();
	errno = 0;
	EXPECT_EQ(vyrl_upd(&held, held), nullptr);
	EXPECT_EQ(errno, EINVAL);
	EXPECT_EQ(held, l.get());

	vyrml_t *m = l->ml;
	errno = 0;
	EXPECT_EQ(vyrml_own_cpy(&m, m), 22);
	EXPECT_EQ(errno, 0) << "vyrml_own_cpy reports, it doesn't set errno";
	EXPECT_EQ(m, l->ml);

	vyrrl_t *r = l->rl;
	EXPECT_EQ(vyrrl_own_cpy(&r, r), 0);
	EXPECT_EQ(r, l->rl);
	EXPECT_EQ(counts(l.get()), Counts(1, 1, 1));
}

// Each replacing operation leaves the caller holding a private copy of the
// source and drops the old reference, which other holders keep using.  The
// copy is made first, so a failed copy costs nothing: *dst keeps its record
// and its reference.
TEST(LabelReplaceAllocFailure, HeldRecordIsReplacedOrKept)
{
	Label src{rich_label()};
	Label held_label = make(1, 1, 1, 1);
	long attempts = vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
		vyrl_t *held = vyrl_get(held_label.get());
		vyrml_t *m = vyrml_get(held_label->ml);
		vyrrl_t *r = vyrrl_get(held_label->rl);
		// The three run one after the other; the first failure stops
		// the rest, so each is swept through all its allocations.
		struct {
			vyrl_t *upd = nullptr;
			int ml = -99, rl = -99;
		} res;
		inj.run([&] {
			if ((res.upd = vyrl_upd(&held, src.get())) && (res.ml = vyrml_own_cpy(&m, src->ml)) == 0)
				res.rl = vyrrl_own_cpy(&r, src->rl);
		});
		if (!inj.fired()) {
			EXPECT_EQ(res.upd, held);
			EXPECT_EQ(res.rl, 0);
			EXPECT_EQ(vyrl_cmp(held, src.get(), 0), 1);
			EXPECT_EQ(vyrml_cmp(m, src->ml), 1);
			EXPECT_EQ(vyrrl_cmp(r, src->rl, 0), 1);
			EXPECT_TRUE(held->ml != src->ml && m != src->ml && r != src->rl) << "private copies";
		} else if (!res.upd) {
			EXPECT_EQ(held, held_label.get());
		} else if (res.ml != 0) {
			EXPECT_EQ(res.ml, ENOMEM);
			EXPECT_EQ(m, held_label->ml);
		} else {
			EXPECT_EQ(res.rl, -1);
			EXPECT_EQ(r, held_label->rl);
		}
		vyrl_put(held);
		vyrml_put(m);
		vyrrl_put(r);
		EXPECT_EQ(counts(held_label.get()), Counts(1, 1, 1));
	});
	EXPECT_EQ(attempts, 6 + 2 + 3 + 1);
}

} // namespace
