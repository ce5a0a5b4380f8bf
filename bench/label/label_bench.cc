// Label core: cost of the decisions, of normalisation and of the record
// lifetime operations.
#include "label/label_values.hh"

#include <vyr/label.h>

#include <benchmark/benchmark.h>

#include <cstring>
#include <random>
#include <vector>

namespace {

using label_values::part;

// An entry with the given right bits; attr plays no part here.
vyr_role_t role(uint64_t id, uint8_t rights)
{
	return label_values::role(id, 0, rights);
}

// The full mandatory decision: child test, type flags, level, categories,
// integrity.  The request passes every test so that none is skipped.
void BM_vyrml_permission(benchmark::State &state)
{
	vyrml_t subject = part(3, 3, 0x7, 0);
	vyrml_t object = part(3, 2, 0x7, VYR_TYPE_CCNRI);
	int request = VYR_REQ_READ | VYR_REQ_WRITE | VYR_REQ_OBJ_TYPE;
	for (auto _ : state) {
		benchmark::DoNotOptimize(&subject);
		benchmark::DoNotOptimize(&object);
		benchmark::DoNotOptimize(vyrml_permission(&subject, &object, request));
	}
}
BENCHMARK(BM_vyrml_permission);

// Worst case of the merge pass: two lists of n entries with no common id
// (even against odd ids), so both are walked to the end.
void BM_vyrrl_permission(benchmark::State &state)
{
	const auto n = static_cast<uint32_t>(state.range(0));
	std::vector<vyr_role_t> s, o;
	for (uint32_t k = 0; k < n; ++k) {
		s.push_back(role(2 * uint64_t{n - k} + 2, 0xF));
		o.push_back(role(2 * uint64_t{n - k} + 1, 0xF));
	}
	vyrrl_t subject{n, 0, s.data(), nullptr, 1};
	vyrrl_t object{n, 0, o.data(), nullptr, 1};
	for (auto _ : state)
		benchmark::DoNotOptimize(vyrrl_permission(&subject, &object, VYR_REQ_READ));
	state.SetComplexityN(state.range(0));
}
BENCHMARK(BM_vyrrl_permission)->Arg(8)->Arg(64)->Arg(1024)->Complexity(benchmark::oN);

// Normalising a shuffled list with some duplicate ids; the copy of the
// input into the work buffer is part of each iteration.
void BM_vyr_roles_normalize(benchmark::State &state)
{
	const auto n = static_cast<uint32_t>(state.range(0));
	std::vector<vyr_role_t> input;
	std::mt19937_64 rng(1);
	for (uint32_t k = 0; k < n; ++k)
		input.push_back(role(rng() % (n + n / 4), 1));
	std::vector<vyr_role_t> work(n);
	for (auto _ : state) {
		std::memcpy(work.data(), input.data(), n * sizeof(vyr_role_t));
		uint32_t count = n;
		vyr_roles_normalize(work.data(), &count);
		benchmark::DoNotOptimize(count);
		benchmark::ClobberMemory();
	}
}
BENCHMARK(BM_vyr_roles_normalize)->Arg(16)->Arg(256);

// A deep copy of a label with a blob and two role lists, and its release.
void BM_vyrl_dup(benchmark::State &state)
{
	const vyr_role_t r1[] = {role(9, 1), role(5, 2), role(1, 4)};
	const vyr_role_t r2[] = {role(8, 1), role(2, 2)};
	vyrl_t *src = vyrl_get_new_init_mac_roles(3, 2, 0xFF, 1, r1, 3, r2, 2);
	src->ml->blob = static_cast<unsigned char *>(std::malloc(16));
	std::memset(src->ml->blob, 7, 16);
	src->ml->blob_size = 16;
	for (auto _ : state) {
		vyrl_t *copy = vyrl_dup(src);
		benchmark::DoNotOptimize(copy);
		vyrl_put(copy);
	}
	vyrl_put(src);
}
BENCHMARK(BM_vyrl_dup);

void BM_vyrl_get_put(benchmark::State &state)
{
	vyrl_t *l = vyrl_get_new();
	for (auto _ : state) {
		benchmark::DoNotOptimize(vyrl_get(l));
		vyrl_put(l);
	}
	vyrl_put(l);
}
BENCHMARK(BM_vyrl_get_put);

} // namespace

BENCHMARK_MAIN();
