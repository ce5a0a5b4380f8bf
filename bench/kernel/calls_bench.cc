// Kernel label reads through the service stand-in, beside a bare getxattr of
// the same attribute (the floor: what any label read on a file must cost),
// the service's command on its own, and the raw whole-label round trip.
//
// The service is pointed at the "user" attribute namespace unless
// VYR_TAVREL_XATTR_NS is set, so the program runs unprivileged.  The files
// live in a fresh directory under $TMPDIR (default /tmp).

#include <vyr/kernel.h>
#include <vyr/label.h>
#include <vyr/raw.h>

#include <fcntl.h>
#include <sys/xattr.h>
#include <unistd.h>

#include "contract/tavrel_base.h"

#include <benchmark/benchmark.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

namespace {

std::string g_dir;
std::string g_small;  // label without blob and roles
std::string g_large;  // 64-byte blob and 16 roles
std::string g_attr;

vyrl_t *large_label() {
    vyr_role_t r1[10], r2[6];
    for (int i = 0; i < 10; ++i) r1[i] = vyr_role_t{static_cast<uint64_t>(1000 - i), static_cast<uint32_t>(i), 7};
    for (int i = 0; i < 6; ++i) r2[i] = vyr_role_t{static_cast<uint64_t>(500 - i), static_cast<uint32_t>(i), 3};
    vyrl_t *l = vyrl_get_new_init_mac_roles(3, 2, 0xff00ff, 4, r1, 10, r2, 6);
    if (l == nullptr) return nullptr;
    auto *blob = static_cast<unsigned char *>(std::malloc(64));
    if (blob == nullptr) {
        vyrl_put(l);
        return nullptr;
    }
    for (int i = 0; i < 64; ++i) blob[i] = static_cast<unsigned char>(i);
    l->ml->blob = blob;
    l->ml->blob_size = 64;
    return l;
}

bool make_file(const std::string &path, vyrl_t *label) {
    const int fd = open(path.c_str(), O_CREAT | O_WRONLY, 0600);
    if (fd < 0) return false;
    close(fd);
    return vyr_set_path(path.c_str(), label) == 0;
}

bool setup() {
    if (std::getenv("VYR_TAVREL_XATTR_NS") == nullptr) setenv("VYR_TAVREL_XATTR_NS", "user", 1);
    g_attr = std::string(std::getenv("VYR_TAVREL_XATTR_NS")) + ".vyrlabel";
    const char *tmp = std::getenv("TMPDIR");
    std::string tmpl = std::string(tmp != nullptr ? tmp : "/tmp") + "/vyr-kernel-bench-XXXXXX";
    if (mkdtemp(tmpl.data()) == nullptr) return false;
    g_dir = tmpl;
    g_small = g_dir + "/small";
    g_large = g_dir + "/large";
    vyrl_t *small = vyrl_get_new_init_mac(2, 1, 0x11, 4);
    vyrl_t *large = large_label();
    const bool ok = small != nullptr && large != nullptr && make_file(g_small, small) && make_file(g_large, large);
    if (small != nullptr) vyrl_put(small);
    if (large != nullptr) vyrl_put(large);
    return ok;
}

void teardown() {
    unlink(g_small.c_str());
    unlink(g_large.c_str());
    rmdir(g_dir.c_str());
}

// The buffer is as large as the one the stand-in reads into: the kernel
// allocates and clears as much as it is offered, so a larger one would make
// the floor slower than the service's own read.
void bare_getxattr(benchmark::State &state, const std::string &path) {
    char buf[512];
    for (auto _ : state) {
        const ssize_t n = getxattr(path.c_str(), g_attr.c_str(), buf, sizeof buf);
        if (n <= 0) {
            state.SkipWithError("getxattr failed");
            break;
        }
        benchmark::DoNotOptimize(buf);
    }
}

// The floor plus what every label read must allocate whatever its speed:
// the three records of a new label and, for a label with blob and roles,
// its three buffers and a second read once their sizes are known.  What
// vyr_get_path costs beyond this row is the library's own work and the
// service's.
void getxattr_and_records(benchmark::State &state, const std::string &path, bool blob_roles) {
    char buf[512];
    for (auto _ : state) {
        vyrl_t *l = vyrl_get_new();
        ssize_t n = getxattr(path.c_str(), g_attr.c_str(), buf, sizeof buf);
        if (blob_roles && l != nullptr) {
            l->ml->blob = static_cast<unsigned char *>(std::malloc(64));
            l->rl->roles1 = static_cast<vyr_role_t *>(std::malloc(vyr_roles_size(10)));
            l->rl->roles2 = static_cast<vyr_role_t *>(std::malloc(vyr_roles_size(6)));
            benchmark::DoNotOptimize(buf);
            n = getxattr(path.c_str(), g_attr.c_str(), buf, sizeof buf);
        }
        if (l == nullptr || n <= 0) {
            if (l != nullptr) vyrl_put(l);
            state.SkipWithError("getxattr or allocation failed");
            break;
        }
        benchmark::DoNotOptimize(buf);
        benchmark::DoNotOptimize(l);
        vyrl_put(l);
    }
}

// One get command on a label whose buffers already have the room the
// service needs, so it fits in one pass: what the service's own work adds
// to the floor, with no records made or dropped.
void service_command(benchmark::State &state, const std::string &path) {
    vyrl_t *l = vyr_get_path(path.c_str());
    if (l == nullptr) {
        state.SkipWithError("vyr_get_path failed");
        return;
    }
    for (auto _ : state) {
        vyr_label_cmd_t cmd{};
        cmd.target.path = path.c_str();
        cmd.label = l;
        if (tavrel_open() < 0 || tavrel_syscall_ioctl(TAVREL_CMD_GET_PATH, &cmd) != 0) {
            state.SkipWithError("get command failed");
            break;
        }
        benchmark::DoNotOptimize(l->ml->lev);
    }
    vyrl_put(l);
}

void get_path(benchmark::State &state, const std::string &path) {
    for (auto _ : state) {
        vyrl_t *l = vyr_get_path(path.c_str());
        if (l == nullptr) {
            state.SkipWithError("vyr_get_path failed");
            break;
        }
        benchmark::DoNotOptimize(l->ml->lev);
        vyrl_put(l);
    }
}

void BM_Getxattr_Small(benchmark::State &state) { bare_getxattr(state, g_small); }
void BM_GetxattrRecords_Small(benchmark::State &state) { getxattr_and_records(state, g_small, false); }
void BM_ServiceCommand_Small(benchmark::State &state) { service_command(state, g_small); }
void BM_GetPath_Small(benchmark::State &state) { get_path(state, g_small); }
void BM_Getxattr_BlobRoles(benchmark::State &state) { bare_getxattr(state, g_large); }
void BM_GetxattrRecords_BlobRoles(benchmark::State &state) { getxattr_and_records(state, g_large, true); }
void BM_ServiceCommand_BlobRoles(benchmark::State &state) { service_command(state, g_large); }
void BM_GetPath_BlobRoles(benchmark::State &state) { get_path(state, g_large); }

void BM_RawRoundTrip_BlobRoles(benchmark::State &state) {
    vyrl_t *l = large_label();
    for (auto _ : state) {
        uint64_t size = 0;
        uint8_t *raw = vyrl_get_raw(l, &size);
        vyrl_t *back = vyrl_get_from_raw(raw, size);
        benchmark::DoNotOptimize(back);
        vyrl_put(back);
        std::free(raw);
    }
    vyrl_put(l);
}

BENCHMARK(BM_Getxattr_Small);
BENCHMARK(BM_GetxattrRecords_Small);
BENCHMARK(BM_ServiceCommand_Small);
BENCHMARK(BM_GetPath_Small);
BENCHMARK(BM_Getxattr_BlobRoles);
BENCHMARK(BM_GetxattrRecords_BlobRoles);
BENCHMARK(BM_ServiceCommand_BlobRoles);
BENCHMARK(BM_GetPath_BlobRoles);
BENCHMARK(BM_RawRoundTrip_BlobRoles);

}  // namespace

int main(int argc, char **argv) {
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
    if (!setup()) {
        std::perror("kernel bench set-up (does the file system take user attributes?)");
        teardown();
        return 1;
    }
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    teardown();
    return 0;
}
