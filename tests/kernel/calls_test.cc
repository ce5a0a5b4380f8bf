// Kernel label calls against the scripted label service of
// support/kdouble: the commands and target words sent, the E2BIG retry loop
// and its buffers, and what each failure leaves behind.
#include <vyr/kernel.h>
#include <vyr/label.h>
#include <vyr/session.h>

#include "support/failalloc.h"
#include "support/kdouble/kdouble.h"
#include "support/scratch_dir.hh"

#include <gtest/gtest.h>

#include <functional>
#include <unistd.h>

namespace {

using namespace kdouble;

// lev 4, ilev 2, cat 0xf00f, type 3, with `blob` bytes and `n1` and `n2`
// roles in descending order; `seed` tells labels of one size apart.
Label sized(uint32_t blob, uint32_t n1, uint32_t n2, uint8_t seed = 0)
{
	Label l{4, 2, 0xf00f, 3, blob, n1, n2};
	for (uint32_t i = 0; i < blob; ++i)
		l.blob[i] = uint8_t(seed + i);
	for (uint32_t i = 0; i < n1; ++i)
		l.roles1[i] = {1000u + seed - i, i, uint8_t(i | 0x80)};
	for (uint32_t i = 0; i < n2; ++i)
		l.roles2[i] = {500u + seed - i, ~i, uint8_t(i)};
	return l;
}

// Room of an offered buffer: exactly what was asked under AddressSanitizer,
// which reports requested sizes; rounded up by less than a chunk otherwise.
bool exact_room(size_t room, size_t asked)
{
#if defined(__SANITIZE_ADDRESS__)
	return room == asked;
#else
	return asked == 0 ? room == 0 : room >= asked && room < asked + 32;
#endif
}

uint64_t word_of(const void *p) { return reinterpret_cast<uintptr_t>(p); }
int ucnts(const vyrl_t *l) { return int(vyrl_ucnt(l) + vyrml_ucnt(l->ml) + vyrrl_ucnt(l->rl)); }

// Every call sends its own command number and its target word as the
// service sees it: the path's address, or the number widened with its sign.
// A setter sends the caller's label as it stands, returns the command's own
// result, and leaves the label and its use counts as they were.
TEST(KernelCalls, CommandsTargetsAndSentLabels)
{
	static const char kPath[] = "/p";
	const auto got = [](vyrl_t *l) { return vyrl_put(l), 0; };
	const struct {
		const char *name;
		std::function<int(vyrl_t *)> call;
		int cmd;
		uint64_t target;
	} cases[] = {
	    {"get_path", [&](vyrl_t *) { return got(vyr_get_path(kPath)); }, 24, word_of(kPath)},
	    {"get_lpath", [&](vyrl_t *) { return got(vyr_get_lpath(kPath)); }, 33, word_of(kPath)},
	    {"get_fd -1", [&](vyrl_t *) { return got(vyr_get_fd(-1)); }, 23, ~uint64_t{0}},
	    {"get_pid INT_MIN", [&](vyrl_t *) { return got(vyr_get_pid(INT32_MIN)); }, 20, 0xffffffff80000000u},
	    {"set_path", [](vyrl_t *l) { return vyr_set_path(kPath, l); }, 22, word_of(kPath)},
	    {"set_lpath", [](vyrl_t *l) { return vyr_set_lpath(kPath, l); }, 32, word_of(kPath)},
	    {"set_fd -1", [](vyrl_t *l) { return vyr_set_fd(-1, l); }, 21, ~uint64_t{0}},
	    {"set_pid", [](vyrl_t *l) { return vyr_set_pid(99, l); }, 19, 99},
	};
	const vyr_role_t r1[] = {{30, 1, 7}, {20, 2, 6}}, r2[] = {{5, 3, 0xff}};
	vyrl_t *mine = vyrl_get_new_init_mac_roles(6, 1, 0x8000000000000001u, 0xbeef, r1, 2, r2, 1);
	const Label before = capture(mine);
	for (const auto &c : cases) {
		SCOPED_TRACE(c.name);
		svc = Service{};
		svc.set_rc = 5;
		const int rc = c.call(mine);
		ASSERT_EQ(svc.ncalls, 1u);
		EXPECT_EQ(svc.calls[0].cmd, c.cmd);
		EXPECT_EQ(svc.calls[0].target, c.target);
		EXPECT_EQ(svc.opens, 1);
		if (!is_get(c.cmd)) {
			EXPECT_EQ(rc, 5);
			EXPECT_EQ(svc.calls[0].label, mine);
			EXPECT_EQ(svc.calls[0].sent, before);
		}
		EXPECT_EQ(capture(mine), before);
		EXPECT_EQ(ucnts(mine), 3);
	}
	vyrl_put(mine);
}

// The retry loop, under every allocation failure: the first pass offers no
// room; each later pass offers exactly the sizes the service asked for in
// the one before, in buffers of exactly that size and only where a size is
// not 0; the label is filled in place; a buffer of an earlier pass is
// released when it is replaced; a failure in any pass leaves nothing.
TEST(KernelCalls, RetryLoop)
{
	std::vector<int> stuck(41, E2BIG); // a real E2BIG, then 40 scripted ones
	stuck[0] = 0;
	const struct {
		const char *name;
		std::vector<Label> labels; // the label, and what it grows to after each E2BIG
		std::vector<int> errs;
		size_t passes;
		long allocs; // all of them, on the way to the result
		int err;     // of a call that fails, 0 when it succeeds
	} cases[] = {
	    {"no blob, no roles: one pass", {sized(0, 0, 0)}, {}, 1, 3, 0},
	    {"roles1 only", {sized(0, 2, 0)}, {}, 2, 4, 0},
	    {"blob and both lists", {sized(64, 10, 6)}, {}, 2, 6, 0},
	    {"grows twice in between", {sized(4, 1, 0), sized(10, 3, 2, 7), sized(11, 5, 2, 9)}, {}, 4, 11, 0},
	    {"no limit of its own", {sized(8, 2, 1)}, stuck, 42, 126, 0},
	    {"fails in the first pass", {sized(16, 2, 2)}, {ENOENT}, 1, 3, ENOENT},
	    {"fails after E2BIG", {sized(16, 2, 2)}, {0, EACCES}, 2, 6, EACCES},
	    {"fails after two E2BIG", {sized(16, 2, 2)}, {0, E2BIG, EIO}, 3, 9, EIO},
	};
	for (const auto &c : cases) {
		SCOPED_TRACE(c.name);
		const long attempts = vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			svc = Service{};
			svc.labels = c.labels;
			svc.errs = c.errs;
			errno = 0;
			vyrl_t *l = inj.run([] { return vyr_get_path("/x"); });
			if (inj.fired() || c.err != 0) {
				EXPECT_EQ(l, nullptr);
				EXPECT_EQ(errno, inj.fired() ? ENOMEM : c.err);
				return;
			}
			ASSERT_NE(l, nullptr);
			EXPECT_EQ(capture(l), c.labels.back());
			EXPECT_EQ(ucnts(l), 3);
			ASSERT_EQ(svc.ncalls, c.passes);
			EXPECT_EQ(svc.opens, int(c.passes)); // before every pass
			for (size_t pass = 0; pass < c.passes; ++pass) {
				SCOPED_TRACE(pass);
				EXPECT_EQ(svc.calls[pass].cmd, 24);
				EXPECT_EQ(svc.calls[pass].label, l);
				for (int k = 0; k < 3; ++k) {
					const uint32_t want = pass == 0 ? 0 : svc.calls[pass - 1].asked[k];
					EXPECT_EQ(svc.calls[pass].offered[k], want) << k;
					EXPECT_TRUE(exact_room(svc.calls[pass].room[k], k == 0 ? want : 16u * want)) << k;
				}
			}
			vyrl_put(l);
		});
		EXPECT_EQ(attempts, c.allocs + 1);
	}
}

// vyr_init answers 1 (not -1) when the service can't be opened, and then no
// command goes out: every call fails with the open's errno.
TEST(KernelCalls, ChannelOpenAndClose)
{
	svc = Service{};
	EXPECT_EQ(vyr_init(), 0);
	EXPECT_EQ(vyr_release(), 0);
	EXPECT_EQ(svc.closes, 1);
	svc.open_err = EACCES;
	EXPECT_EQ(vyr_init(), 1);
	errno = 0;
	EXPECT_EQ(vyr_get_path("/x"), nullptr);
	EXPECT_EQ(errno, EACCES);
	vyrl_t *l = vyrl_get_new_init_mac(3, 3, 3, 3);
	errno = 0;
	EXPECT_EQ(vyr_set_pid(1, l), -1);
	EXPECT_EQ(errno, EACCES);
	EXPECT_EQ(vyr_set_sys_max_fd(0), -1);
	EXPECT_EQ(svc.ncalls, 0u);
	vyrl_put(l);
}

// The system maximum operations read "/" by path, change the type word (and
// for the ccnr form the integrity level) and write the rest unchanged; when
// "/" can't be read nothing is written.
TEST(KernelCalls, SystemMaximumLabels)
{
	Label root = sized(5, 2, 1);
	root.ilev = 3, root.type = 6;
	static const char kTarget[] = "/target";
	const struct {
		std::function<int()> call;
		int set_cmd;
		uint64_t target;
		uint16_t type;
		uint8_t ilev;
	} cases[] = {
	    {[] { return vyr_set_sys_max_path(kTarget); }, 22, word_of(kTarget), 7, 3},
	    {[] { return vyr_set_sys_max_ccnr_path(kTarget); }, 22, word_of(kTarget), 1, 0},
	    {[] { return vyr_set_sys_max_fd(11); }, 21, 11, 7, 3},
	};
	for (const auto &c : cases)
		vyr_test::sweep_alloc_failures([&](vyr_test::Injector &inj) {
			svc = Service{};
			svc.labels = {root};
			svc.set_rc = 3; // the setter's own result comes back
			errno = 0;
			const int rc = inj.run(c.call);
			EXPECT_EQ(rc, inj.fired() ? -1 : 3);
			if (inj.fired()) {
				EXPECT_EQ(errno, ENOMEM);
				EXPECT_LE(svc.ncalls, 2u); // only the reads of "/"
				return;
			}
			ASSERT_EQ(svc.ncalls, 3u); // "/": E2BIG, fill; then the set
			for (const Call &read : {svc.calls[0], svc.calls[1]})
				EXPECT_TRUE(read.cmd == 24 && std::string(reinterpret_cast<const char *>(read.target)) == "/");
			Label want = root;
			want.type = c.type, want.ilev = c.ilev;
			EXPECT_EQ(svc.calls[2].cmd, c.set_cmd);
			EXPECT_EQ(svc.calls[2].target, c.target);
			EXPECT_EQ(svc.calls[2].sent, want);
		});
}

// A directory that already carries the right label is not written again
// (the file system can't show a rewrite of the same value); a wrong label
// is replaced by the caller's, with "ccnri" added for its integrity level.
TEST(KernelCalls, SessionDirectoryLabelIsWrittenOnlyWhenWrong)
{
	vyr_test::ScratchDir dir; // mode 0700 and our own: nothing else to repair
	vyrl_t *l = vyrl_get_new_init_mac(4, 1, 0x3, 0);
	const Label right{4, 1, 0x3, VYR_TYPE_CCNRI};
	for (bool wrong : {false, true}) {
		svc = Service{};
		svc.labels = {wrong ? Label{} : right};
		EXPECT_EQ(vyrlugm_mkdir(dir.path().c_str(), l, getuid(), getgid(), 0700), 0);
		ASSERT_EQ(svc.ncalls, wrong ? 2u : 1u);
		EXPECT_EQ(svc.calls[svc.ncalls - 1].sent, wrong ? right : Label{});
	}
	vyrl_put(l);
}

} // namespace
