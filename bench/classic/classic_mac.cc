// Costs of the classic value: its decisions, its flat form and its numeric
// text form (no name databases configured, so the reader's level lookup
// finds no back-end and falls back to the number at once).
#include <vyr/classic.h>

#include <benchmark/benchmark.h>

#include <cstdlib>

namespace {

struct Values {
    mac_t *subject = mac_init(MAC_TYPE_SUBJECT);
    mac_t *object = mac_init(MAC_TYPE_LOW);
    Values() {
        setenv("VYR_DBROUTE_CONF", "/dev/null", 1);
        mac_set_lev(subject, 7);
        mac_set_cat(subject, 0xff00ff);
        mac_set_lev(object, 3);
        mac_set_cat(object, 0xf000f);
    }
    ~Values() {
        mac_free(subject);
        mac_free(object);
    }
};

void BM_MacPermit(benchmark::State &state) {
    Values v;
    for (auto _ : state) benchmark::DoNotOptimize(mac_permit(v.subject, v.object, MAC_REQ_READ | MAC_REQ_WRITE));
}
BENCHMARK(BM_MacPermit);

void BM_MacCmp(benchmark::State &state) {
    Values v;
    mac_set_type(v.object, MAC_TYPE_OBJECT);
    for (auto _ : state) benchmark::DoNotOptimize(mac_cmp(v.subject, v.object));
}
BENCHMARK(BM_MacCmp);

void BM_MacFlatRoundTrip(benchmark::State &state) {
    Values v;
    unsigned char buf[MAC_EXT_SIZE];
    for (auto _ : state) {
        mac_copy_ext(buf, v.object, sizeof buf);
        mac_t *back = mac_copy_int(buf);
        benchmark::DoNotOptimize(back);
        mac_free(back);
    }
}
BENCHMARK(BM_MacFlatRoundTrip);

void BM_MacToTextNumeric(benchmark::State &state) {
    Values v;
    for (auto _ : state) {
        char *t = mac_to_text(v.object, nullptr, MAC_TEXT_LEV | MAC_TEXT_CAT | MAC_TEXT_TYPE);
        benchmark::DoNotOptimize(t);
        std::free(t);
    }
}
BENCHMARK(BM_MacToTextNumeric);

void BM_MacFromTextNumeric(benchmark::State &state) {
    Values v;
    for (auto _ : state) benchmark::DoNotOptimize(mac_from_text(v.object, "200:ffff0000ffff:1002d"));
}
BENCHMARK(BM_MacFromTextNumeric);

void BM_MacFromTextLetters(benchmark::State &state) {
    Values v;
    for (auto _ : state) benchmark::DoNotOptimize(mac_from_text(v.object, "3:f:r-xr-x"));
}
BENCHMARK(BM_MacFromTextLetters);

}  // namespace
BENCHMARK_MAIN();
