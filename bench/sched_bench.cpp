// Scheduler benchmarks: the cost of handing out tiles, and how a compute-bound tile loop
// scales with threads.
#include <benchmark/benchmark.h>
#include <sys/resource.h>

#include <chrono>
#include <cmath>

#include "bench/silent_io.h"
#include "core/message.h"
#include "core/render_io.h"
#include "platform/work_server.h"
#include "render/tile_renderer.h"

namespace {

class EmptyRenderer : public ox::TileRenderer {
protected:
    bool renderTile(int, const ox::Tile &tile) override {
        benchmark::DoNotOptimize(tile.xMin);
        return true;
    }
};

/// Per pixel a short chain of dependent floating-point operations (about a microsecond per
/// tile row), nothing shared between threads.
class ComputeRenderer : public ox::TileRenderer {
protected:
    bool renderTile(int, const ox::Tile &tile) override {
        float sum = 0.0f;
        for (uint32_t y = tile.yMin; y <= tile.yMax; ++y) {
            for (uint32_t x = tile.xMin; x <= tile.xMax; ++x) {
                float v = float(x) * 0.001f + float(y) * 0.002f;
                for (int i = 0; i < 64; ++i) v = v * 0.999f + std::sqrt(v + 1.0f) * 0.001f;
                sum += v;
            }
        }
        benchmark::DoNotOptimize(sum);
        return true;
    }
};

double processCpuSeconds() {
    rusage u{};
    getrusage(RUSAGE_SELF, &u);
    return double(u.ru_utime.tv_sec + u.ru_stime.tv_sec) +
           double(u.ru_utime.tv_usec + u.ru_stime.tv_usec) * 1e-6;
}

ox::TileRunSettings region(uint32_t w, uint32_t h, int tile, int threads, int scheme) {
    ox::TileRunSettings s;
    s.xMax = w - 1;
    s.yMax = h - 1;
    s.tileWidth = s.tileHeight = tile;
    s.threadCount = threads;
    s.scheme = scheme;
    return s;
}

// Tiles handed out per second with empty tiles: the scheduler's own overhead (the tile
// mutex, the abort test and the progress report per tile), list building included.
void BM_TileHandOut(benchmark::State &state) {
    const int threads = int(state.range(0));
    oxbench::SilentIO io;
    EmptyRenderer r;
    const auto s = region(512, 512, 1, threads, ox::kTileLeftToRight);
    for (auto _ : state) r.run(s, io);
    state.SetItemsProcessed(state.iterations() * 512 * 512);
}
BENCHMARK(BM_TileHandOut)->Arg(1)->Arg(2)->UseRealTime()->Unit(benchmark::kMillisecond);

// Building the tile orders alone, per scheme, on a 1024 x 1024 grid of tiles.
void BM_TileOrderBuild(benchmark::State &state) {
    auto order = ox::createTileOrder(int32_t(state.range(0)));
    for (auto _ : state) order->build(0, 1023, 0, 1023, 1, 1);
    state.SetItemsProcessed(state.iterations() * 1024 * 1024);
    state.SetLabel(ox::kTileSchemeNames[state.range(0)]);
}
BENCHMARK(BM_TileOrderBuild)->DenseRange(0, 3)->Unit(benchmark::kMillisecond);

// A compute-bound tile loop on 1 and 2 threads; compare the real times for the scaling.
void BM_ComputeTiles(benchmark::State &state) {
    const int threads = int(state.range(0));
    oxbench::SilentIO io;
    ComputeRenderer r;
    const auto s = region(256, 256, 16, threads, ox::kTileHilbert);
    double cpu = 0.0, wall = 0.0;
    for (auto _ : state) {
        const double c0 = processCpuSeconds();
        const auto w0 = std::chrono::steady_clock::now();
        r.run(s, io);
        wall += std::chrono::duration<double>(std::chrono::steady_clock::now() - w0).count();
        cpu += processCpuSeconds() - c0;
    }
    state.SetItemsProcessed(state.iterations() * 256 * 256);
    // The cores the loop really got: on a busy machine two threads may share one core, and
    // the real time then cannot show the scaling.
    state.counters["cores_used"] = wall > 0.0 ? cpu / wall : 0.0;
    // Pixels per CPU second: equal for 1 and 2 threads when the scheduler costs nothing.
    state.counters["px_per_cpu_s"] = cpu > 0.0 ? double(state.iterations()) * 65536.0 / cpu : 0.0;
}
BENCHMARK(BM_ComputeTiles)->Arg(1)->Arg(2)->UseRealTime()->Unit(benchmark::kMillisecond);

// Work items per second through the work server with empty items (2 workers).
class EmptyWork : public ox::Work {
public:
    bool run(const std::atomic<bool> &, int) override { return true; }
};

void BM_WorkServerItems(benchmark::State &state) {
    constexpr int kItems = 20000;
    for (auto _ : state) {
        ox::WorkServer server(2);
        for (int i = 0; i < kItems; ++i) server.addWork(new EmptyWork);
        server.start();
        ox::setTypeEnabled(ox::kMsgProgress, false);
        server.waitWithProgress(0.001f, 0.5f);
        ox::setTypeEnabled(ox::kMsgProgress, true);
    }
    state.SetItemsProcessed(state.iterations() * kItems);
}
BENCHMARK(BM_WorkServerItems)->UseRealTime()->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
