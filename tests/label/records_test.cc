// Label records: constructors, use counts, copies, static labels, and the
// release of everything built when an allocation fails.
#include "label_test_util.hh"

#include <atomic>
#include <thread>
#include <vector>

using namespace label_test;
using vyr_test::FailAlloc;

namespace {

void expect_empty(const vyrl_t *l)
{
	ASSERT_NE(l->ml, nullptr);
	ASSERT_NE(l->rl, nullptr);
	EXPECT_EQ(vyrl_ucnt(l), 1);
	EXPECT_EQ(vyrml_ucnt(l->ml), 1);
	EXPECT_EQ(vyrrl_ucnt(l->rl), 1);
	EXPECT_EQ(l->ml->lev, 0);
	EXPECT_EQ(l->ml->ilev, 0);
	EXPECT_EQ(l->ml->cat, 0u);
	EXPECT_EQ(l->ml->type, 0);
	EXPECT_EQ(l->ml->blob_size, 0u);
	EXPECT_EQ(l->ml->blob, nullptr);
	EXPECT_EQ(l->rl->nroles1, 0u);
	EXPECT_EQ(l->rl->nroles2, 0u);
	EXPECT_EQ(l->rl->roles1, nullptr);
	EXPECT_EQ(l->rl->roles2, nullptr);
}

TEST(LabelRecords, EmptyConstructorsGiveZeroRecordsWithCountOne)
{
	Label a{vyrl_get_new()};
	expect_empty(a.get());
	Label b{vyrl_get_new_init_mr(nullptr, nullptr)};
	expect_empty(b.get());
	EXPECT_NE(a->ml, b->ml);
	EXPECT_NE(a->rl, b->rl);
}

TEST(LabelRecords, InitConstructorsStoreFullWidthValues)
{
	Label l{vyrl_get_new_init_mac(200, 255, 0x8000000000000001ull, 0xFFFF)};
	EXPECT_EQ(vyrl_lev(l.get()), 200);
	EXPECT_EQ(vyrl_ilev(l.get()), 255);
	EXPECT_EQ(vyrl_cat(l.get()), 0x8000000000000001ull);
	EXPECT_EQ(vyrl_type(l.get()), 0xFFFF);
	EXPECT_EQ(l->ml->blob, nullptr);
	EXPECT_EQ(l->rl->roles1, nullptr);
	EXPECT_EQ(l->rl->nroles1, 0u);

	// Values wider than a field keep only the field's low bits.
	unsigned wide_lev = 0x1FF, wide_type = 0x10007;
	Ml m{vyrml_get_new_init(static_cast<uint8_t>(wide_lev), 1, 2, static_cast<uint16_t>(wide_type))};
	EXPECT_EQ(m->lev, 255);
	EXPECT_EQ(m->type, 7);
	EXPECT_EQ(vyrml_ucnt(m.get()), 1);
}

TEST(LabelRecords, GetAndNcGetRaiseOneCountAndPutUndoesIt)
{
	vyrl_t *l = nullptr;
	EXPECT_EQ(blocks_left_by([&] { l = vyrl_get_new(); }), 3u);
	EXPECT_EQ(vyrl_get(l), l);
	EXPECT_EQ(vyrl_ucnt(l), 2);
	EXPECT_EQ(vyrlnc_get(l), l);
	EXPECT_EQ(vyrl_ucnt(l), 3);
	// The parts' counts belong to the parts: a label reference leaves them.
	EXPECT_EQ(vyrml_ucnt(l->ml), 1);
	vyrl_put(l);
	vyrl_put(l);
	EXPECT_EQ(vyrl_ucnt(l), 1);
	EXPECT_EQ(FailAlloc::live(), 3u);
	vyrl_put(l);
	EXPECT_EQ(FailAlloc::live(), 0u) << "the last put frees the label and both parts";
	FailAlloc::reset();
}

TEST(LabelRecords, SharedPartLivesUntilTheLastLabelDropsIt)
{
	Ml m{vyrml_get_new_init(1, 2, 3, 4)};
	m->blob = heap_blob({10, 20, 30, 40, 50});
	m->blob_size = 5;
	vyrml_t *part = m.release();

	vyrl_t *first = vyrl_get_new_init_mr(part, nullptr);
	ASSERT_NE(first, nullptr);
	EXPECT_EQ(first->ml, part);
	EXPECT_EQ(vyrml_ucnt(part), 1) << "the label takes over the caller's reference";
	vyrl_t *second = vyrl_get_new_init_mr(vyrml_get(part), nullptr);
	ASSERT_NE(second, nullptr);
	EXPECT_EQ(vyrml_ucnt(part), 2);
	EXPECT_NE(first->rl, second->rl);

	vyrl_put(first);
	EXPECT_EQ(vyrml_ucnt(part), 1);
	EXPECT_EQ(second->ml->blob[4], 50) << "blob still alive";
	vyrl_put(second);
}

TEST(LabelRecords, PutSkipsNullMembers)
{
	std::size_t left = blocks_left_by([] {
		auto *l = static_cast<vyrl_t *>(std::calloc(1, sizeof(vyrl_t)));
		l->ucnt = 1;
		l->rl = vyrrl_get_new();
		vyrl_put(l);
		l = static_cast<vyrl_t *>(std::calloc(1, sizeof(vyrl_t)));
		l->ucnt = 1;
		l->ml = vyrml_get_new();
		vyrl_put(l);
	});
	EXPECT_EQ(left, 0u);
}

TEST(LabelRecords, PutFreesBlobAndBothRoleArrays)
{
	std::size_t left = blocks_left_by([] {
		vyrl_t *l = rich_label();
		vyrl_put(l);
	});
	EXPECT_EQ(left, 0u);
}

TEST(LabelRecords, UseCountReadsWidenWithSign)
{
	Label l{vyrl_get_new()};
	l->ucnt = -2;
	l->ml->ucnt = -3;
	l->rl->ucnt = INT32_MIN;
	EXPECT_EQ(vyrl_ucnt(l.get()), -2);
	EXPECT_EQ(vyrml_ucnt(l->ml), -3);
	EXPECT_EQ(vyrrl_ucnt(l->rl), int64_t{INT32_MIN});
	l->ucnt = l->ml->ucnt = l->rl->ucnt = 1;
}

TEST(LabelRecords, StaticLabels)
{
	struct Row {
		vyrl_t *label;
		uint16_t type;
	} rows[] = {{VYRL_ZERO, 0}, {VYRL_EQU, VYR_TYPE_EHOLE}};
	for (const Row &row : rows) {
		vyrl_t *s = row.label;
		EXPECT_EQ(vyrl_ucnt(s), 1);
		EXPECT_EQ(vyrml_ucnt(s->ml), 1);
		EXPECT_EQ(vyrrl_ucnt(s->rl), 1);
		EXPECT_EQ(vyrl_type(s), row.type);

		Label copy{vyrl_dup(s)};
		ASSERT_NE(copy, nullptr);
		EXPECT_NE(copy.get(), s);
		EXPECT_NE(copy->ml, s->ml);
		EXPECT_NE(copy->rl, s->rl);
		EXPECT_EQ(vyrl_type(copy.get()), row.type);
		EXPECT_EQ(vyrl_lev(copy.get()) | vyrl_ilev(copy.get()), 0);
		EXPECT_EQ(vyrl_cat(copy.get()), 0u);
		EXPECT_EQ(copy->ml->blob, nullptr);
		EXPECT_EQ(copy->rl->roles1, nullptr);
		EXPECT_EQ(copy->rl->roles2, nullptr);
		EXPECT_EQ(vyrl_ucnt(copy.get()), 1);
		EXPECT_EQ(vyrml_ucnt(copy->ml), 1);
		EXPECT_EQ(vyrrl_ucnt(copy->rl), 1);

		vyrl_put(vyrl_get(s));
		EXPECT_EQ(vyrl_ucnt(s), 1) << "a get/put pair on a static label is balanced";
	}
}

TEST(LabelRecords, MlDupGivesAPrivateBlob)
{
	Ml src{vyrml_get_new_init(7, 6, 5, 4)};
	src->blob = heap_blob({1, 2, 3, 4, 5});
	src->blob_size = 5;
	vyrml_get(src.get());
	Ml copy{vyrml_dup(src.get())};
	ASSERT_NE(copy, nullptr);
	EXPECT_EQ(vyrml_ucnt(src.get()), 2) << "the source's count is left alone";
	vyrml_put(src.get());
	ASSERT_NE(copy->blob, nullptr);
	EXPECT_NE(copy->blob, src->blob);
	EXPECT_EQ(vyrml_cmp(copy.get(), src.get()), 1);
	EXPECT_EQ(vyrml_ucnt(copy.get()), 1);
	src.reset();
	const unsigned char expect[] = {1, 2, 3, 4, 5};
	EXPECT_EQ(std::memcmp(copy->blob, expect, 5), 0) << "copy outlives its source";
}

TEST(LabelRecords, MlDupCopiesNoBlobUnlessBothPointerAndSize)
{
	Ml zero_size{vyrml_get_new()};
	zero_size->blob = heap_blob({9});
	Ml null_blob{vyrml_get_new()};
	null_blob->blob_size = 3;

	Ml a{vyrml_dup(zero_size.get())};
	EXPECT_EQ(a->blob, nullptr);
	EXPECT_EQ(a->blob_size, 0u);
	Ml b{vyrml_dup(null_blob.get())};
	EXPECT_EQ(b->blob, nullptr);
	EXPECT_EQ(b->blob_size, 3u) << "the size is copied as it stands";
}

TEST(LabelRecords, RlDupCopiesCountsAsTheyStand)
{
	Rl src{vyrrl_get_new()};
	src->nroles1 = 3; // with no array
	src->roles2 = heap_roles({role(1)});
	Rl copy{vyrrl_dup(src.get())};
	ASSERT_NE(copy, nullptr);
	EXPECT_EQ(copy->nroles1, 3u);
	EXPECT_EQ(copy->roles1, nullptr);
	EXPECT_EQ(copy->nroles2, 0u);
	EXPECT_EQ(copy->roles2, nullptr);
}

TEST(LabelRecords, LabelDupSharesNothing)
{
	Label src{rich_label()};
	Label copy{vyrl_dup(src.get())};
	ASSERT_NE(copy, nullptr);
	EXPECT_NE(copy->ml, src->ml);
	EXPECT_NE(copy->rl, src->rl);
	EXPECT_NE(copy->ml->blob, src->ml->blob);
	EXPECT_NE(copy->rl->roles1, src->rl->roles1);
	EXPECT_NE(copy->rl->roles2, src->rl->roles2);
	EXPECT_EQ(vyrl_cmp(copy.get(), src.get(), 0), 1);
	vyrl_set_lev(copy.get(), 9);
	copy->rl->roles2[0].rights = 0xF;
	EXPECT_EQ(vyrl_lev(src.get()), 3);
	EXPECT_EQ(src->rl->roles2[0].rights, 4);
	EXPECT_EQ(vyrl_ml(copy.get()), copy->ml);
	EXPECT_EQ(vyrl_rl(copy.get()), copy->rl);
}

TEST(LabelRecords, RoleArrayHelpers)
{
	EXPECT_EQ(vyr_roles_size(0), 0u);
	EXPECT_EQ(vyr_roles_size(3), 48u);
	EXPECT_EQ(vyr_roles_size(uint64_t{1} << 40), uint64_t{1} << 44);

	// A block copy carries the padding bytes along.
	vyr_role_t src[2];
	std::memset(src, 0xAB, sizeof src);
	src[0].id = 5;
	src[1].rights = 3;
	Roles copy{vyr_role_dup(src, 2)};
	ASSERT_NE(copy, nullptr);
	EXPECT_EQ(std::memcmp(copy.get(), src, sizeof src), 0);
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

	// Attempts = allocations made + 1; a smaller number would mean some
	// allocation was never made to fail.
	EXPECT_EQ(sweep_constructor([] { return vyrml_get_new(); }, put_m), 2);
	EXPECT_EQ(sweep_constructor([] { return vyrrl_get_new(); }, put_r), 2);
	EXPECT_EQ(sweep_constructor([] { return vyrl_get_new(); }, put_l), 4);
	EXPECT_EQ(sweep_constructor([] { return vyrml_get_new_init(1, 2, 3, 4); }, put_m), 2);
	EXPECT_EQ(sweep_constructor([] { return vyrl_get_new_init_mr(nullptr, nullptr); }, put_l), 4);
	EXPECT_EQ(sweep_constructor([] { return vyrl_get_new_init_mac(1, 2, 3, 4); }, put_l), 4);
	EXPECT_EQ(sweep_constructor([&] { return vyrml_dup(rich->ml); }, put_m), 3);
	EXPECT_EQ(sweep_constructor([&] { return vyrrl_dup(rich->rl); }, put_r), 4);
	EXPECT_EQ(sweep_constructor([&] { return vyrl_dup(rich.get()); }, put_l), 7);
	EXPECT_EQ(sweep_constructor([&] { return vyr_role_dup(r1, 3); }, free_r), 2);
	EXPECT_EQ(sweep_constructor([] { return vyrrl_get_new_alloc(3, 4); }, put_r), 4);
	EXPECT_EQ(sweep_constructor([&] { return vyrrl_get_new_init_roles(r1, 3, r2, 1); }, put_r), 4);
	EXPECT_EQ(sweep_constructor([&] { return vyrl_get_new_init_mac_roles(1, 2, 3, 4, r1, 3, r2, 1); },
	                            put_l),
	          6);
	EXPECT_EQ(sweep_constructor([] { return vyrr_get_new_init(1, 2, 3); }, free_r), 2);
	EXPECT_EQ(sweep_constructor([&] { return duplicate_role(&r1[0]); }, free_r), 2);
}

TEST(LabelRecordsAllocFailure, MrLeavesTheCallersPartsWithTheCaller)
{
	vyr_test::sweep_alloc_failures([](vyr_test::Injector &inj) {
		vyrml_t *ml = vyrml_get_new_init(1, 1, 1, 1);
		vyrrl_t *rl = vyrrl_get_new();
		vyrl_t *l = inj.run([&] { return vyrl_get_new_init_mr(ml, rl); });
		if (inj.fired()) {
			EXPECT_EQ(l, nullptr);
			EXPECT_EQ(vyrml_ucnt(ml), 1);
			EXPECT_EQ(vyrrl_ucnt(rl), 1);
			vyrml_put(ml);
			vyrrl_put(rl);
			return;
		}
		ASSERT_NE(l, nullptr);
		EXPECT_EQ(l->ml, ml);
		EXPECT_EQ(l->rl, rl);
		vyrl_put(l);
	});
	// With one part given, only the part made here is released on failure.
	long attempts = vyr_test::sweep_alloc_failures([](vyr_test::Injector &inj) {
		vyrml_t *ml = vyrml_get_new();
		vyrl_t *l = inj.run([&] { return vyrl_get_new_init_mr(ml, nullptr); });
		if (inj.fired()) {
			EXPECT_EQ(l, nullptr);
			EXPECT_EQ(vyrml_ucnt(ml), 1);
			vyrml_put(ml);
			return;
		}
		vyrl_put(l);
	});
	EXPECT_EQ(attempts, 3);
}

// ---- Concurrency -------------------------------------------------------------

TEST(LabelRecordsThreads, ConcurrentGetPutCountsExactlyAndFreesOnce)
{
	constexpr int kThreads = 4;
	constexpr int kRounds = 50000;
	vyrl_t *l = nullptr;
	EXPECT_EQ(blocks_left_by([&] { l = vyrl_get_new(); }), 3u);
	ASSERT_NE(l, nullptr);

	// Runs body on every thread at once: the threads wait at a gate so
	// that their loops overlap instead of running one after the other.
	auto run_together = [](auto body) {
		std::atomic<bool> go{false};
		std::vector<std::thread> threads;
		for (int t = 0; t < kThreads; ++t)
			threads.emplace_back([&] {
				while (!go.load())
					std::this_thread::yield();
				body();
			});
		go.store(true);
		for (auto &th : threads)
			th.join();
	};

	// Phase 1: concurrent gets, then concurrent puts; no update may be
	// lost.  A lost update needs two threads inside one update at the same
	// moment, so the phase is repeated to give a broken count a fair chance
	// to show.
	for (int rep = 0; rep < 4; ++rep) {
		run_together([l] {
			for (int k = 0; k < kRounds; ++k)
				vyrl_get(l);
		});
		ASSERT_EQ(vyrl_ucnt(l), 1 + int64_t{kThreads} * kRounds);
		run_together([l] {
			for (int k = 0; k < kRounds; ++k)
				vyrl_put(l);
		});
		ASSERT_EQ(vyrl_ucnt(l), 1);
	}

	// Phase 2: each thread owns one reference, churns get/put pairs and
	// then drops its reference; the creator's reference is dropped first.
	// The record must be freed exactly once, by whichever thread is last.
	for (int t = 0; t < kThreads; ++t)
		vyrl_get(l);
	vyrl_put(l);
	run_together([l] {
		for (int k = 0; k < kRounds; ++k)
			vyrl_put(vyrl_get(l));
		vyrl_put(l);
	});
	EXPECT_EQ(FailAlloc::live(), 0u);
	FailAlloc::reset();
}

} // namespace
