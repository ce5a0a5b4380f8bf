// Cost of the files back-end's operations on a database of 256 levels and
// 64 categories. The floor of a lookup on an unchanged file is one stat.
#include <sys/stat.h>
#include <unistd.h>

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <string>

#include <benchmark/benchmark.h>

#include "contract/backend.h"
#include "contract/dbroute.h"
#include "store.hh"

extern "C" {
VYR_BACKEND_DECLARE_LEV(files)
VYR_BACKEND_DECLARE_CAT(files)
}

namespace {

// One database directory for the whole run.
const std::string& bench_dir() {
    static const std::string dir = [] {
        char tmpl[] = "/tmp/files-bench-XXXXXX";
        if (::mkdtemp(tmpl) == nullptr) std::abort();
        std::string d = tmpl;
        std::ofstream lev(d + "/levels");
        for (int v = 0; v < 256; ++v) lev << "level" << v << ':' << v << '\n';
        std::ofstream cat(d + "/categories");
        for (int b = 0; b < 64; ++b) cat << "cat" << b << ':' << std::hex << (UINT64_C(1) << b) << std::dec << '\n';
        std::strncpy(dbroute_cfg.files_dir, d.c_str(), sizeof dbroute_cfg.files_dir - 1);
        return d;
    }();
    return dir;
}

void free_record(levent_t* e) {
    std::free(e->name);
    std::free(e);
}

void BM_StatFloor(benchmark::State& state) {
    const std::string path = bench_dir() + "/levels";
    struct stat st{};
    for (auto _ : state) benchmark::DoNotOptimize(::stat(path.c_str(), &st));
}
BENCHMARK(BM_StatFloor);

void BM_GetLevVal(benchmark::State& state) {
    bench_dir();
    void* db = files_openlevdb_r();
    unsigned v = 0;
    for (auto _ : state) {
        levent_t* e = files_getlevval_r(db, v++ & 0xff);
        if (e == nullptr) state.SkipWithError("lookup failed");
        else free_record(e);
    }
    files_closelevdb_r(db);
}
BENCHMARK(BM_GetLevVal);

void BM_GetCatNam(benchmark::State& state) {
    bench_dir();
    void* db = files_opencatdb_r();
    std::string names[64];
    for (int b = 0; b < 64; ++b) names[b] = "cat" + std::to_string(b);
    unsigned i = 0;
    for (auto _ : state) {
        catent_t* e = files_getcatnam_r(db, names[i++ & 63].c_str());
        if (e == nullptr) {
            state.SkipWithError("lookup failed");
            break;
        }
        std::free(e->name);
        std::free(e);
    }
    files_closecatdb_r(db);
}
BENCHMARK(BM_GetCatNam);

// What label text does per field: open, one lookup, close.
void BM_OpenLookupClose(benchmark::State& state) {
    bench_dir();
    unsigned v = 0;
    for (auto _ : state) {
        void* db = files_openlevdb_r();
        levent_t* e = files_getlevval_r(db, v++ & 0xff);
        if (e != nullptr) free_record(e);
        files_closelevdb_r(db);
    }
}
BENCHMARK(BM_OpenLookupClose);

// A file that changed must be parsed again: 256 lines.
void BM_ReparseChangedFile(benchmark::State& state) {
    const std::string a = bench_dir() + "/levels";
    const std::string b = bench_dir() + "/levels.copy";
    std::ofstream(b) << std::ifstream(a).rdbuf();
    vyr::files::SnapshotPtr snap;
    bool flip = false;
    for (auto _ : state) {
        flip = !flip;  // two paths share one cache slot: every call re-parses
        if (vyr::files::current(vyr::files::Db::Lev, flip ? a : b, snap) != 0) state.SkipWithError("read failed");
        benchmark::DoNotOptimize(snap.get());
    }
}
BENCHMARK(BM_ReparseChangedFile);

// A durable put (lock, rewrite, fsync, rename) into the 256-level file.
void BM_PutLevel(benchmark::State& state) {
    bench_dir();
    void* db = files_openlevdb_r();
    const levent_t e{const_cast<char*>("level7"), 7};
    for (auto _ : state)
        if (files_putlevent_r(db, &e) != 0) state.SkipWithError("put failed");
    files_closelevdb_r(db);
}
BENCHMARK(BM_PutLevel)->Iterations(200);

}  // namespace

BENCHMARK_MAIN();
