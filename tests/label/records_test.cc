// Label records: constructors, use counts, copies, static labels, and the
// release of everything built when an allocation fails.  (The use counts
// under concurrent threads are tested in threads/.)
#include "label_test_util.hh"

#include <utility>

using namespace label_test;
using vyr_test::FailAlloc;

namespace {

// New empty labels equal VYRL_ZERO (all zero, no blob, NULL role lists),
// and copies of the static labels equal their source.
TEST(LabelRecords, EmptyLabelsAndCopiesOfTheStaticLabels)
{
	struct Row {
		const char *what;
		vyrl_t *(*make)();
		vyrl_t *equals;
	} rows[] = {
	    {"get_new", [] { return vyrl_get_new(); }, VYRL_ZERO},
	    {"init_mr(NULL, NULL)", [] { return vyrl_get_new_init_mr(nullptr, nullptr); }, VYRL_ZERO},
	    {"dup(ZERO)", [] { return vyrl_dup(VYRL_ZERO); }, VYRL_ZERO},
	    {"dup(EQU)", [] { return vyrl_dup(VYRL_EQU); }, VYRL_EQU},
	};
	EXPECT_EQ(vyrl_type(VYRL_EQU), VYR_TYPE_EHOLE);
	for (const Row &row : rows) {
		SCOPED_TRACE(row.what);
		Label l{row.make()};
		ASSERT_TRUE(l && l->ml && l->rl);
		EXPECT_EQ(vyrl_cmp(l.get(), row.equals, 0), 1);
		EXPECT_EQ(l->ml->blob, nullptr);
		EXPECT_EQ(counts(l.get()), Counts(1, 1, 1));
	}
	// The static labels start at count 1, so a get/put pair on them is
	// balanced and frees nothing.
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
	EXPECT_EQ(vyrl_ucnt(l), 3);
	EXPECT_EQ(vyrml_ucnt(l->ml), 1) << "a label reference leaves the parts' counts alone";
	l->rl->ucnt = -2;
	EXPECT_EQ(vyrrl_ucnt(l->rl), -2) << "counts are read with their sign";
	l->rl->ucnt = 1;
	vyrl_put(l);
	vyrl_put(l);
	EXPECT_EQ(FailAlloc::live(), 6u);
	vyrl_put(l);
	EXPECT_EQ(FailAlloc::live(), 0u) << "label, both parts, blob and both role arrays";
	FailAlloc::reset();
}

// vyrl_put skips a NULL member and still frees the rest.
TEST(LabelRecords, PutSkipsNullMembers)
{
	EXPECT_EQ(blocks_left_by([] {
		vyrl_t *l = vyrl_get_new();
		vyrml_put(std::exchange(l->ml, nullptr));
		vyrl_put(l);
		l = vyrl_get_new();
		vyrrl_put(std::exchange(l->rl, nullptr));
		vyrl_put(l);
	}), 0u);
}

// Copies share nothing with their source and leave its counts alone.  A
// count or size is copied as it stands, but a buffer only where both a
// pointer and a non-zero count or size are there.
TEST(LabelRecords, Copies)
{
	Label src{rich_label()};
	Label copy{vyrl_dup(src.get())};
	ASSERT_NE(copy, nullptr);
	EXPECT_EQ(vyrl_cmp(copy.get(), src.get(), 0), 1);
	EXPECT_NE(copy->ml, src->ml);
	EXPECT_NE(copy->rl, src->rl);
	EXPECT_NE(copy->ml->blob, src->ml->blob);
	EXPECT_NE(copy->rl->roles1, src->rl->roles1);
	EXPECT_NE(copy->rl->roles2, src->rl->roles2);
	EXPECT_EQ(counts(src.get()), Counts(1, 1, 1));
	EXPECT_EQ(vyrl_ml(copy.get()), copy->ml);
	EXPECT_EQ(vyrl_rl(copy.get()), copy->rl);

	vyr_role_t one[] = {role(1)};
	vyrrl_t odd_rl{3, 0, nullptr, one, 1};
	Rl rc{vyrrl_dup(&odd_rl)};
	ASSERT_NE(rc, nullptr);
	EXPECT_EQ(rc->nroles1, 3u);
	EXPECT_EQ(rc->roles1, nullptr);
	EXPECT_EQ(rc->roles2, nullptr);
	vyrml_t sized = part(0, 0, 0), unsized = part(0, 0, 0);
	sized.blob_size = 3;
	unsized.blob = reinterpret_cast<unsigned char *>(0x8); // never followed
	for (const vyrml_t *m : {&sized, &unsized}) {
		Ml mc{vyrml_dup(m)};
		ASSERT_NE(mc, nullptr);
		EXPECT_EQ(mc->blob, nullptr);
		EXPECT_EQ(mc->blob_size, m->blob_size);
	}
}

// ---- Allocation failure -------------------------------------------------------

TEST(LabelRecordsAllocFailure, EveryConstructorAndCopyReleasesWhatItBuilt)
{
	Label rich{rich_label()};
	const vyr_role_t r1[] = {role(3), role(9), role(3)};
	const vyr_role_t r2[] = {role(1)};
	auto put_l = [](vyrl_t *l) { vyrl_put(l); };
	auto put_m = [](vyrml_t *m) { vyrml_put(m); };
	auto put_r = [](vyrrl_t *r) { vyrrl_put(r); };
	auto free_r = [](vyr_role_t *r) { std::free(r); };

	// Attempts = allocations made + 1; fewer would mean some allocation was
	// never made to fail.
	EXPECT_EQ(sweep_constructor([] { return vyrml_get_new(); }, put_m), 2);
	EXPECT_EQ(sweep_constructor([] { return vyrrl_get_new(); }, put_r), 2);
	EXPECT_EQ(sweep_constructor([] { return vyrl_get_new(); }, put_l), 4);
	EXPECT_EQ(sweep_constructor([] { return vyrl_get_new_init_mac(1, 2, 3, 4); }, put_l), 4);
	EXPECT_EQ(sweep_constructor([&] { return vyrml_dup(rich->ml); }, put_m), 3);
	EXPECT_EQ(sweep_constructor([&] { return vyrrl_dup(rich->rl); }, put_r), 4);
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
		long attempts = vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			vyrml_t *ml = vyrml_get_new();
			vyrrl_t *rl = give_rl ? vyrrl_get_new() : nullptr;
			vyrl_t *l = inj.run([&] { return vyrl_get_new_init_mr(ml, rl); });
			if (!inj.fired()) {
				ASSERT_NE(l, nullptr);
				EXPECT_EQ(l->ml, ml);
				vyrl_put(l);
				return;
			}
			EXPECT_EQ(l, nullptr);
			EXPECT_EQ(vyrml_ucnt(ml), 1);
			vyrml_put(ml);
			if (rl) {
				EXPECT_EQ(vyrrl_ucnt(rl), 1);
				vyrrl_put(rl);
			}
		});
		EXPECT_EQ(attempts, give_rl ? 2 : 3);
	}
}

} // namespace
