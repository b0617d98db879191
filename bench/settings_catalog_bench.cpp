// Costs of the whole configuration tree: building the defaults, copying, writing and loading the
// default file, and the checks after a load.
#include <benchmark/benchmark.h>

#include <string>

#include "config/ox_config.h"
#include "config/settings_checks.h"
#include "config/xml.h"

namespace {

void BM_DefaultConfiguration(benchmark::State &state) {
    for (auto _ : state) {
        ox::OXConfig config;
        benchmark::DoNotOptimize(&config);
    }
}
BENCHMARK(BM_DefaultConfiguration)->Unit(benchmark::kMicrosecond);

void BM_CloneConfiguration(benchmark::State &state) {
    const ox::OXConfig config;
    for (auto _ : state) benchmark::DoNotOptimize(config.clone());
}
BENCHMARK(BM_CloneConfiguration)->Unit(benchmark::kMicrosecond);

void BM_WriteDefaultFile(benchmark::State &state) {
    const ox::OXConfig config;
    std::string text;
    for (auto _ : state) {
        ox::writeSettingsToString(text, config);
        benchmark::DoNotOptimize(text.data());
    }
    state.SetBytesProcessed(int64_t(state.iterations()) * int64_t(text.size()));
}
BENCHMARK(BM_WriteDefaultFile)->Unit(benchmark::kMicrosecond);

void BM_LoadDefaultFileAndCheck(benchmark::State &state) {
    std::string text;
    ox::writeSettingsToString(text, ox::OXConfig());
    for (auto _ : state) {
        ox::OXConfig config;
        ox::loadSettingsFromMemory(text, config);
        benchmark::DoNotOptimize(ox::checkLoadedSettings(config));
    }
    state.SetBytesProcessed(int64_t(state.iterations()) * int64_t(text.size()));
}
BENCHMARK(BM_LoadDefaultFileAndCheck)->Unit(benchmark::kMicrosecond);

}  // namespace

BENCHMARK_MAIN();
