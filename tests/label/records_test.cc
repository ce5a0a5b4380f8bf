// Label records: constructors, use counts, copies, static labels, and the
// release of everything built when an allocation fails.
#include "label_test_util.hh"

#include <utility>

using namespace label_test;
using vyr_test::FailAlloc;

namespace {

// New empty labels equal VYRL_ZERO; copies of the static labels equal their source.
TEST(LabelRecords, EmptyLabelsAndCopiesOfTheStaticLabels)
{
	const std::pair<vyrl_t *(*)(), vyrl_t *> rows[] = {{[] { return vyrl_get_new(); }, VYRL_ZERO},
	    {[] { return vyrl_dup(VYRL_ZERO); }, VYRL_ZERO}, {[] { return vyrl_dup(VYRL_EQU); }, VYRL_EQU}};
	EXPECT_EQ(vyrl_type(VYRL_EQU), VYR_TYPE_EHOLE);
	for (const auto &[make, equals] : rows) {
		Label l{make()};
		ASSERT_TRUE(l && l->ml && l->rl);
		EXPECT_EQ(vyrl_cmp(l.get(), equals, 0), 1) << (&make - &rows[0].first);
		EXPECT_EQ(l->ml->blob, nullptr);
		EXPECT_EQ(counts(l.get()), Counts(1, 1, 1));
	}
	// The static labels start at count 1: a get/put pair frees nothing.
	for (vyrl_t *s : {VYRL_ZERO, VYRL_EQU}) {
		vyrl_put(vyrl_get(s));
		EXPECT_EQ(counts(s), Counts(1, 1, 1));
	}
}

TEST(LabelRecords, OnlyTheLastPutFreesTheLabelWithAllItOwns)
{
	vyrl_t *l = nullptr;
	ASSERT_EQ(blocks_left_by([&] { l = rich_label(); }), 6u);
	EXPECT_EQ(vyrl_get(l), l);
	EXPECT_EQ(vyrlnc_get(l), l);
	EXPECT_EQ(counts(l), Counts(3, 1, 1)) << "a label reference leaves the parts' counts alone";
	l->rl->ucnt = -2;
	EXPECT_EQ(vyrrl_ucnt(l->rl), -2) << "counts are read with their sign";
	l->rl->ucnt = 1;
	vyrl_put(l);
	vyrl_put(l);
	EXPECT_EQ(FailAlloc::live(), 6u);
	vyrl_put(l);
	EXPECT_EQ(FailAlloc::live(), 0u) << "label, both parts, blob and both role arrays";
	// A NULL member is skipped and the rest still freed.
	EXPECT_EQ(blocks_left_by([] {
		vyrl_t *a = vyrl_get_new(), *b = vyrl_get_new();
		vyrml_put(std::exchange(a->ml, nullptr));
		vyrrl_put(std::exchange(b->rl, nullptr));
		vyrl_put(a);
		vyrl_put(b);
	}), 0u);
	FailAlloc::reset();
}

// Copies share nothing with their source and leave its counts alone.  A
// buffer is copied only where both a pointer and a non-zero count are there.
TEST(LabelRecords, Copies)
{
	Label src{rich_label()};
	Label copy{vyrl_dup(src.get())};
	ASSERT_NE(copy, nullptr);
	EXPECT_EQ(vyrl_cmp(copy.get(), src.get(), 0), 1);
	EXPECT_TRUE(copy->ml != src->ml && copy->rl != src->rl && copy->ml->blob != src->ml->blob);
	EXPECT_TRUE(copy->rl->roles1 != src->rl->roles1 && copy->rl->roles2 != src->rl->roles2);
	EXPECT_EQ(counts(src.get()), Counts(1, 1, 1));
	EXPECT_TRUE(vyrl_ml(copy.get()) == copy->ml && vyrl_rl(copy.get()) == copy->rl);

	vyr_role_t one[] = {role(1)};
	vyrrl_t odd_rl{3, 0, nullptr, one, 1};
	Rl rc{vyrrl_dup(&odd_rl)};
	ASSERT_NE(rc, nullptr);
	EXPECT_TRUE(rc->nroles1 == 3 && rc->roles1 == nullptr && rc->roles2 == nullptr);
	vyrml_t sized = part(0, 0, 0), unsized = part(0, 0, 0);
	sized.blob_size = 3;
	unsized.blob = reinterpret_cast<unsigned char *>(0x8); // never followed
	for (const vyrml_t *m : {&sized, &unsized}) {
		Ml mc{vyrml_dup(m)};
		ASSERT_NE(mc, nullptr);
		EXPECT_TRUE(mc->blob == nullptr && mc->blob_size == m->blob_size);
	}
}

TEST(LabelRecordsAllocFailure, EveryConstructorAndCopyReleasesWhatItBuilt)
{
	Label rich{rich_label()};
	const vyr_role_t r1[] = {role(3), role(9), role(3)}, r2[] = {role(1)};
	auto put_l = [](vyrl_t *l) { vyrl_put(l); };
	auto put_r = [](vyrrl_t *r) { vyrrl_put(r); };
	auto free_r = [](vyr_role_t *r) { std::free(r); };
	// Attempts = allocations + 1; fewer would mean some allocation never failed.  The
	// part constructors and copies are swept inside the label ones that use them.
	EXPECT_EQ(sweep_constructor([] { return vyrl_get_new(); }, put_l), 4);
	EXPECT_EQ(sweep_constructor([] { return vyrl_get_new_init_mac(1, 2, 3, 4); }, put_l), 4);
	EXPECT_EQ(sweep_constructor([&] { return vyrl_dup(rich.get()); }, put_l), 7);
	EXPECT_EQ(sweep_constructor([&] { return vyr_role_dup(r1, 3); }, free_r), 2);
	EXPECT_EQ(sweep_constructor([] { return vyrrl_get_new_alloc(3, 4); }, put_r), 4);
	EXPECT_EQ(sweep_constructor([&] { return vyrrl_get_new_init_roles(r1, 3, r2, 1); }, put_r), 4);
	EXPECT_EQ(sweep_constructor([&] { return vyrl_get_new_init_mac_roles(1, 2, 3, 4, r1, 3, r2, 1); }, put_l), 6);
	EXPECT_EQ(sweep_constructor([] { return vyrr_get_new_init(1, 2, 3); }, free_r), 2);
	EXPECT_EQ(sweep_constructor([&] { return duplicate_role(&r1[0]); }, free_r), 2);
}

// A failed vyrl_get_new_init_mr leaves the parts given to it with the
// caller, and releases only a part that it made itself.
TEST(LabelRecordsAllocFailure, MrLeavesTheCallersPartsWithTheCaller)
{
	for (bool give_rl : {true, false}) {
		EXPECT_EQ(vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			vyrml_t *ml = vyrml_get_new();
			vyrrl_t *rl = give_rl ? vyrrl_get_new() : nullptr;
			vyrl_t *l = inj.run([&] { return vyrl_get_new_init_mr(ml, rl); });
			if (!inj.fired()) {
				ASSERT_NE(l, nullptr);
				EXPECT_EQ(l->ml, ml);
				return vyrl_put(l);
			}
			EXPECT_EQ(l, nullptr);
			EXPECT_EQ(vyrml_ucnt(ml), 1);
			vyrml_put(ml);
			if (rl) {
				EXPECT_EQ(vyrrl_ucnt(rl), 1);
				vyrrl_put(rl);
			}
		}), give_rl ? 2 : 3);
	}
}

} // namespace
