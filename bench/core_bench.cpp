// Costs of the reporting machinery that the render loops call: a filtered-out message, a
// timer interval, a benchmark interval on the thread's own timer, and a progress report that
// prints nothing.
#include <benchmark/benchmark.h>

#include "core/benchmark.h"
#include "core/message.h"
#include "core/render_io_console.h"
#include "core/timer.h"

namespace {

void BM_FilteredMessage(benchmark::State &state) {
    ox::resetMessageFilters();  // debug messages are off by default
    int i = 0;
    for (auto _ : state) ox::message(ox::kMsgDebug, 6, "texel %d of %d", ++i, 1000);
}
BENCHMARK(BM_FilteredMessage);

void BM_TimerStartStop(benchmark::State &state) {
    ox::Timer t;
    for (auto _ : state) {
        t.start();
        benchmark::DoNotOptimize(t.stop());
    }
    state.counters["overhead_ticks"] = static_cast<double>(ox::Timer::overhead());
}
BENCHMARK(BM_TimerStartStop);

void BM_BenchmarkRegistryInterval(benchmark::State &state) {
    auto &registry = ox::BenchmarkRegistry::instance();
    for (auto _ : state) {
        registry.start(ox::kMergePointBench);
        registry.stop(ox::kMergePointBench);
    }
}
BENCHMARK(BM_BenchmarkRegistryInterval)->Threads(1)->Threads(2);

void BM_SilentProgress(benchmark::State &state) {
    ox::resetMessageFilters();
    ox::setTypeEnabled(ox::kMsgProgress, false);
    ox::RioImpl rio;
    rio.setProgress(0.55f);
    for (auto _ : state) rio.setProgress(0.56f);  // below the next mark: no line
    ox::resetMessageFilters();
}
BENCHMARK(BM_SilentProgress);

}  // namespace

BENCHMARK_MAIN();
