// A get command on a file label against the bare getxattr of the same
// attribute (the floor), for a label with nothing variable (one command) and
// one with a 64-byte blob and 16 roles (offer nothing, then the exact room:
// two commands, as libvyr's retry loop does).  Also a process label read,
// which goes through /proc and the state directory.
#include <benchmark/benchmark.h>

#include <cstdio>
#include <cstdlib>
#include <string>
#include <sys/xattr.h>
#include <unistd.h>
#include <vector>

#include "contract/tavrel_base.h"

namespace {

struct Fixture {
	std::string dir, small, large;
	Fixture()
	{
		char tmpl[] = "/tmp/tavrel-bench-XXXXXX";
		dir = mkdtemp(tmpl);
		setenv("VYR_TAVREL_XATTR_NS", "user", 1);
		setenv("VYR_TAVREL_STATE_DIR", (dir + "/state").c_str(), 1);
		tavrel_open();
		small = touch("small");
		large = touch("large");
	}
	~Fixture()
	{
		tavrel_close();
		unlink(small.c_str());
		unlink(large.c_str());
		rmdir(dir.c_str());
	}
	std::string touch(const char *name)
	{
		std::string p = dir + "/" + name;
		std::fclose(std::fopen(p.c_str(), "w"));
		return p;
	}
};

struct Label {
	vyrml_t ml{};
	vyrrl_t rl{};
	vyrl_t l{&ml, &rl, 1};
	std::vector<unsigned char> blob;
	std::vector<vyr_role_t> roles;
	void offer(uint32_t b, uint32_t n)
	{
		blob.resize(b);
		roles.resize(n);
		ml.blob = b ? blob.data() : nullptr;
		ml.blob_size = b;
		rl.roles1 = n ? roles.data() : nullptr;
		rl.nroles1 = n;
		rl.roles2 = nullptr;
		rl.nroles2 = 0;
	}
};

Fixture &fixture()
{
	static Fixture f;
	return f;
}

void set_label(const std::string &path, uint32_t blob, uint32_t roles)
{
	Label lb;
	lb.offer(blob, roles);
	lb.ml.lev = 3;
	for (uint32_t i = 0; i < roles; ++i)
		lb.roles[i] = vyr_role_t{1000 - i, i, 1};
	vyr_label_cmd_t arg{};
	arg.target.path = path.c_str();
	arg.label = &lb.l;
	if (tavrel_syscall_ioctl(TAVREL_CMD_SET_PATH, &arg) != 0)
		std::abort();
}

// Reads as libvyr does: empty offer, then the room asked for.
void get_label(const char *path, benchmark::State &state)
{
	Label lb;
	vyr_label_cmd_t arg{};
	arg.target.path = path;
	arg.label = &lb.l;
	for (auto _ : state) {
		lb.offer(0, 0);
		tavrel_open();
		while (tavrel_syscall_ioctl(TAVREL_CMD_GET_PATH, &arg) != 0) {
			lb.offer(lb.ml.blob_size, lb.rl.nroles1);
			tavrel_open();
		}
		benchmark::DoNotOptimize(lb.ml.lev);
	}
}

void BM_bare_getxattr(benchmark::State &state)
{
	Fixture &f = fixture();
	set_label(f.small, 0, 0);
	char buf[512];
	for (auto _ : state)
		benchmark::DoNotOptimize(getxattr(f.small.c_str(), "user.vyrlabel", buf, sizeof buf));
}
BENCHMARK(BM_bare_getxattr);

void BM_get_path_small(benchmark::State &state)
{
	Fixture &f = fixture();
	set_label(f.small, 0, 0);
	get_label(f.small.c_str(), state);
}
BENCHMARK(BM_get_path_small);

void BM_get_path_blob64_roles16(benchmark::State &state)
{
	Fixture &f = fixture();
	set_label(f.large, 64, 16);
	get_label(f.large.c_str(), state);
}
BENCHMARK(BM_get_path_blob64_roles16);

void BM_get_own_pid_inherited(benchmark::State &state)
{
	fixture();
	Label lb;
	vyr_label_cmd_t arg{};
	arg.target.num = 0;
	arg.label = &lb.l;
	for (auto _ : state) {
		lb.offer(0, 0);
		benchmark::DoNotOptimize(tavrel_syscall_ioctl(TAVREL_CMD_GET_PID, &arg));
	}
}
BENCHMARK(BM_get_own_pid_inherited);

} // namespace

BENCHMARK_MAIN();
