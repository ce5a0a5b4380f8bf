// Writing whole labels as text, numeric and named, through the real `files`
// back-end with 256 level names and 64 category names, beside snprintf of the
// same numbers as the floor.
//
// A named text costs one level database open, lookup and close and one
// category database open and walk; the walk stops once every bit of the mask
// has a name, so the number of bits set (and where their names stand in the
// file) decides its length.
#include <vyr/text.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include <benchmark/benchmark.h>

#include "files_db.hh"

namespace {

using bench_repr::setup_files_backend;

// The label of every run: level 200, integrity 1, type 3, two roles in each
// list, and the category mask of the benchmark's argument.
struct Label {
	vyr_role_t r1[2] = {{9, 0, 0}, {4, 0, 0}};
	vyr_role_t r2[2] = {{7, 0, 0}, {1, 0, 0}};
	vyrml_t ml{};
	vyrrl_t rl{2, 2, r1, r2, 1};
	vyrl_t l{&ml, &rl, 1};

	explicit Label(uint64_t cat)
	{
		ml.lev = 200;
		ml.ilev = 1;
		ml.cat = cat;
		ml.type = 3;
		ml.ucnt = 1;
	}
};

// Masks: one low bit (found at once), eight bits spread over the file, and
// all 64 (the whole file is walked).
uint64_t mask_of(int64_t arg)
{
	switch (arg) {
	case 1: return 0x1;
	case 8: return 0x0101010101010101ull;
	default: return ~0ull;
	}
}

void text_of_label(benchmark::State &state, int flags)
{
	setup_files_backend();
	Label lab(mask_of(state.range(0)));
	char *probe = vyrl_get_text(&lab.l, flags);
	if (probe == nullptr) {
		state.SkipWithError("no text");
		return;
	}
	state.SetLabel(std::to_string(std::strlen(probe)) + " bytes");
	std::free(probe);
	for (auto _ : state) {
		char *s = vyrl_get_text(&lab.l, flags);
		benchmark::DoNotOptimize(s);
		std::free(s);
	}
}

void BM_LabelTextNumeric(benchmark::State &state) { text_of_label(state, VYR_TEXT_NUMERIC); }
void BM_LabelTextNamed(benchmark::State &state) { text_of_label(state, 0); }

// The floor: the numeric text by snprintf into a stack buffer and one copy
// to the heap, as a caller would get it.
void BM_SnprintfFloor(benchmark::State &state)
{
	Label lab(mask_of(state.range(0)));
	char buf[256];
	for (auto _ : state) {
		std::snprintf(buf, sizeof buf, "%u:%u:0x%lx:0x%x!%ld,%ld:%ld,%ld", unsigned{lab.ml.lev},
		              unsigned{lab.ml.ilev}, static_cast<unsigned long>(lab.ml.cat), unsigned{lab.ml.type},
		              static_cast<long>(lab.r1[0].id), static_cast<long>(lab.r1[1].id),
		              static_cast<long>(lab.r2[0].id), static_cast<long>(lab.r2[1].id));
		char *s = strdup(buf);
		benchmark::DoNotOptimize(s);
		std::free(s);
	}
}

} // namespace

BENCHMARK(BM_SnprintfFloor)->Arg(1)->Arg(64);
BENCHMARK(BM_LabelTextNumeric)->Arg(1)->Arg(64);
BENCHMARK(BM_LabelTextNamed)->Arg(1)->Arg(8)->Arg(64);

BENCHMARK_MAIN();
