// Reading whole labels back from text, numeric and named, through the real
// `files` back-end with 256 level names and 64 category names.
//
// A named read costs one level database open and lookup and one category
// database open with one lookup per name; a numeric read does the same opens
// and lookups (a name is always tried before a number), so the two differ
// mainly in what the lookups find.
#include <vyr/label.h>
#include <vyr/text.h>

#include <cstdio>
#include <cstdlib>
#include <string>

#include <benchmark/benchmark.h>

#include "files_db.hh"

namespace {

using bench_repr::setup_files_backend;

void read_label(benchmark::State &state, const char *text)
{
	setup_files_backend();
	vyrl_t *probe = vyrl_get_from_text(text);
	if (probe == nullptr) {
		state.SkipWithError("text does not read");
		return;
	}
	vyrl_put(probe);
	for (auto _ : state) {
		vyrl_t *l = vyrl_get_from_text(text);
		benchmark::DoNotOptimize(l);
		vyrl_put(l);
	}
}

void BM_ReadNumeric(benchmark::State &state)
{
	read_label(state, "200:1:0x8000000000000401:0x5!9,5,3:1");
}
BENCHMARK(BM_ReadNumeric);

void BM_ReadNamed(benchmark::State &state)
{
	read_label(state, "level200:High:cat0,cat10,cat63:ccnr,ehole!9,5,3:1");
}
BENCHMARK(BM_ReadNamed);

// The same numbers without any database: the parsing floor of a label text.
void BM_ScanNumbersFloor(benchmark::State &state)
{
	const char *text = "200:1:0x8000000000000401:0x5!9,5,3:1";
	for (auto _ : state) {
		unsigned lev = 0, ilev = 0, type = 0;
		unsigned long long cat = 0;
		unsigned long r[4] = {};
		const int n = std::sscanf(text, "%u:%u:%llx:%x!%lu,%lu,%lu:%lu", &lev, &ilev, &cat, &type,
		                          &r[0], &r[1], &r[2], &r[3]);
		benchmark::DoNotOptimize(n);
	}
}
BENCHMARK(BM_ScanNumbersFloor);

} // namespace

BENCHMARK_MAIN();
