// Field access and label algebra.
#include "label_test_util.hh"

#include <cerrno>

using namespace label_test;

namespace {

Label make(uint8_t lev, uint8_t ilev, uint64_t cat, uint16_t type)
{
	return Label{vyrl_get_new_init_mac(lev, ilev, cat, type)};
}

struct Fields {
	uint8_t lev, ilev;
	uint64_t cat;
	uint16_t type;
	bool operator==(const Fields &) const = default;
};

Fields fields(const vyrl_t *l)
{
	return {vyrl_lev(l), vyrl_ilev(l), vyrl_cat(l), vyrl_type(l)};
}

std::ostream &operator<<(std::ostream &os, const Fields &f)
{
	return os << "(" << int{f.lev} << ", " << int{f.ilev} << ", 0x" << std::hex << f.cat << ", 0x" << f.type
	          << std::dec << ")";
}

// Every one-field operation, on a label that starts at (100, 100, 0xF0, 0x0F).
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
	    {"and_type 0", [](vyrl_t *l) { vyrl_and_type(l, 0); }, {100, 100, 0xF0, 0}},
	    {"or_type", [](vyrl_t *l) { vyrl_or_type(l, 0x8000); }, {100, 100, 0xF0, 0x800F}},
	    {"subtract_type", [](vyrl_t *l) { vyrl_subtract_type(l, 0x3); }, {100, 100, 0xF0, 0x0C}},
	    {"subtract_type all", [](vyrl_t *l) { vyrl_subtract_type(l, 0xFFFF); }, {100, 100, 0xF0, 0}},
	    {"maximize_lev up", [](vyrl_t *l) { vyrl_maximize_lev(l, 200); }, {200, 100, 0xF0, 0x0F}},
	    {"maximize_lev down", [](vyrl_t *l) { vyrl_maximize_lev(l, 50); }, {100, 100, 0xF0, 0x0F}},
	    {"maximize_lev same", [](vyrl_t *l) { vyrl_maximize_lev(l, 100); }, {100, 100, 0xF0, 0x0F}},
	    {"minimize_lev", [](vyrl_t *l) { vyrl_minimize_lev(l, 50); }, {50, 100, 0xF0, 0x0F}},
	    {"minimize_lev 200", [](vyrl_t *l) { vyrl_minimize_lev(l, 200); }, {100, 100, 0xF0, 0x0F}},
	    {"maximize_ilev", [](vyrl_t *l) { vyrl_maximize_ilev(l, 255); }, {100, 255, 0xF0, 0x0F}},
	    {"minimize_ilev", [](vyrl_t *l) { vyrl_minimize_ilev(l, 0); }, {100, 0, 0xF0, 0x0F}},
	    {"minimize_ilev 128", [](vyrl_t *l) { vyrl_minimize_ilev(l, 128); }, {100, 100, 0xF0, 0x0F}},
	};
	for (const Row &row : rows) {
		Label l = make(100, 100, 0xF0, 0x0F);
		l->ml->blob = heap_blob({1});
		l->ml->blob_size = 1;
		vyrrl_t *rl = l->rl;
		row.op(l.get());
		EXPECT_EQ(fields(l.get()), row.expect) << row.what;
		EXPECT_EQ(l->ml->blob_size, 1u) << row.what;
		EXPECT_EQ(l->rl, rl) << row.what;
		EXPECT_EQ(vyrml_ucnt(l->ml), 1) << row.what;
	}
}

TEST(LabelAlgebra, PartFormsMatchLabelForms)
{
	Ml m{vyrml_get_new()};
	vyrml_set_lev(m.get(), 201);
	vyrml_set_ilev(m.get(), 202);
	vyrml_set_cat(m.get(), 0xFF00);
	vyrml_set_type(m.get(), 0xFF);
	vyrml_and_cat(m.get(), 0x0FF0);
	vyrml_or_cat(m.get(), 0x1);
	vyrml_and_type(m.get(), 0x0F);
	vyrml_or_type(m.get(), 0x100);
	EXPECT_EQ(vyrml_lev(m.get()), 201);
	EXPECT_EQ(vyrml_ilev(m.get()), 202);
	EXPECT_EQ(vyrml_cat(m.get()), 0x0F01u);
	EXPECT_EQ(vyrml_type(m.get()), 0x10F);
}

TEST(LabelAlgebra, ChangesShowInEveryLabelSharingThePart)
{
	Label a = make(1, 1, 1, 1);
	Label b{vyrl_get_new_init_mr(vyrml_get(a->ml), nullptr)};
	vyrl_set_cat(a.get(), 0x77);
	vyrl_maximize_lev(a.get(), 9);
	EXPECT_EQ(vyrl_cat(b.get()), 0x77u);
	EXPECT_EQ(vyrl_lev(b.get()), 9);
}

TEST(LabelAlgebra, LevelArithmeticIsUnsigned)
{
	using Fn = uint8_t (*)(uint8_t, uint8_t);
	struct Row {
		Fn fn;
		uint8_t a, b, expect;
	} rows[] = {
	    {vyr_lev_max, 200, 100, 200}, {vyr_lev_max, 100, 200, 200}, {vyr_lev_min, 200, 100, 100},
	    {vyr_lev_min, 0, 255, 0},     {vyr_ilev_max, 200, 100, 200}, {vyr_ilev_max, 128, 127, 128},
	    {vyr_ilev_min, 200, 100, 100}, {vyr_ilev_min, 255, 255, 255},
	};
	for (const Row &row : rows)
		EXPECT_EQ(row.fn(row.a, row.b), row.expect) << int{row.a} << " " << int{row.b};
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
	vyrl_unite(s.get(), s.get());
	EXPECT_EQ(fields(s.get()), (Fields{200, 130, 0, 0}));
}

TEST(LabelAlgebra, CombiningLeavesBlobAndRolesAlone)
{
	Label a{rich_label()};
	Label b{rich_label()};
	unsigned char *blob = a->ml->blob;
	vyr_role_t *roles = a->rl->roles1;
	vyrl_unite(a.get(), b.get());
	vyrl_subtract(a.get(), b.get());
	EXPECT_EQ(a->ml->blob, blob);
	EXPECT_EQ(a->ml->blob_size, 3u);
	EXPECT_EQ(a->rl->roles1, roles);
	EXPECT_EQ(a->rl->nroles1, 2u);
}

// ---- Replacing a held reference ---------------------------------------------------

TEST(LabelReplace, SelfCopyResultsDiffer)
{
	Label l = make(1, 2, 3, 4);
	vyrl_t *held = l.get();
	errno = 0;
	EXPECT_EQ(vyrl_upd(&held, held), nullptr);
	EXPECT_EQ(errno, EINVAL);
	EXPECT_EQ(held, l.get());
	EXPECT_EQ(vyrl_ucnt(held), 1);

	vyrml_t *m = l->ml;
	errno = 0;
	EXPECT_EQ(vyrml_own_cpy(&m, m), 22);
	EXPECT_EQ(errno, 0) << "vyrml_own_cpy reports, it doesn't set errno";
	EXPECT_EQ(m, l->ml);

	vyrrl_t *r = l->rl;
	EXPECT_EQ(vyrrl_own_cpy(&r, r), 0);
	EXPECT_EQ(r, l->rl);
	EXPECT_EQ(vyrml_ucnt(l->ml) + vyrrl_ucnt(l->rl), 2);
}

TEST(LabelReplace, SuccessDropsTheOldReferenceAndHoldsAPrivateCopy)
{
	Label src{rich_label()};

	// The old label is shared: it must survive with one reference less.
	Label other = make(9, 9, 9, 0);
	vyrl_t *held = vyrl_get(other.get());
	vyrl_t *got = vyrl_upd(&held, src.get());
	ASSERT_NE(got, nullptr);
	EXPECT_EQ(got, held);
	EXPECT_EQ(vyrl_ucnt(other.get()), 1);
	EXPECT_EQ(vyrl_cmp(held, src.get(), 0), 1);
	EXPECT_NE(held->ml, src->ml);
	vyrl_put(held);

	// The mandatory part shared by two labels: the other keeps the old part.
	Label sharer = make(5, 5, 5, 5);
	vyrml_t *m = vyrml_get(sharer->ml);
	EXPECT_EQ(vyrml_own_cpy(&m, src->ml), 0);
	EXPECT_EQ(vyrml_ucnt(sharer->ml), 1);
	EXPECT_EQ(vyrml_cmp(m, src->ml), 1);
	vyrml_set_lev(m, 77);
	EXPECT_EQ(vyrl_lev(sharer.get()), 5);
	EXPECT_EQ(vyrl_lev(src.get()), 3);
	vyrml_put(m);

	vyrrl_t *r = vyrrl_get(sharer->rl);
	EXPECT_EQ(vyrrl_own_cpy(&r, src->rl), 0);
	EXPECT_EQ(vyrrl_ucnt(sharer->rl), 1);
	EXPECT_EQ(vyrrl_cmp(r, src->rl, 0), 1);
	EXPECT_NE(r->roles1, src->rl->roles1);
	vyrrl_put(r);
}

TEST(LabelReplaceAllocFailure, FailedCopyKeepsTheHeldRecord)
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
			res.upd = vyrl_upd(&held, src.get());
			if (!res.upd)
				return 0;
			res.ml = vyrml_own_cpy(&m, src->ml);
			if (res.ml != 0)
				return 0;
			res.rl = vyrrl_own_cpy(&r, src->rl);
			return 0;
		});
		if (inj.fired()) {
			if (!res.upd) {
				EXPECT_EQ(held, held_label.get());
			} else if (res.ml != 0) {
				EXPECT_EQ(res.ml, ENOMEM);
				EXPECT_EQ(m, held_label->ml);
			} else {
				EXPECT_EQ(res.rl, -1);
				EXPECT_EQ(r, held_label->rl);
			}
		} else {
			EXPECT_EQ(res.ml, 0);
			EXPECT_EQ(res.rl, 0);
		}
		vyrl_put(held);
		vyrml_put(m);
		vyrrl_put(r);
		EXPECT_EQ(vyrl_ucnt(held_label.get()), 1);
		EXPECT_EQ(vyrml_ucnt(held_label->ml), 1);
		EXPECT_EQ(vyrrl_ucnt(held_label->rl), 1);
	});
	EXPECT_EQ(attempts, 6 + 2 + 3 + 1);
}

} // namespace
