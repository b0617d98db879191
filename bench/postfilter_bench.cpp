// Post filters on a 4096 x 4096 light map with about 30% coverage in UV-island shapes: edge
// dilation at n = 5 and n = 32, premultiply and shape normalization on their own, and the chain
// premultiply, dilation, shape normalization, on one and two threads. Each run starts from a
// fresh frame, so its first round also pays for memory the frame has not used yet. Time is
// wall-clock (UseRealTime); the CPU column is the whole process.
#include <benchmark/benchmark.h>

#include <cmath>
#include <memory>
#include <random>
#include <vector>

#include "bench/silent_io.h"
#include "render/frame.h"
#include "render/post_filter.h"

namespace {

constexpr int kSize = 4096;
constexpr int kCell = 128;  // one island per cell of the layout grid

/// Islands: per cell an ellipse, a rectangle or a triangle of random size and place, drawn so
/// that about 30% of the texels are covered.
struct Islands {
    std::vector<float> z;
    std::vector<ox::Color> color;
    double coverage = 0;
};

const Islands &islands() {
    static const Islands result = [] {
        Islands is;
        is.z.assign(size_t(kSize) * kSize, -1.0f);
        is.color.assign(size_t(kSize) * kSize, ox::Color(0, 0, 0, 0));
        std::mt19937 rng(7);
        std::uniform_real_distribution<float> u(0.0f, 1.0f);
        size_t covered = 0;
        for (int cy = 0; cy < kSize / kCell; ++cy)
            for (int cx = 0; cx < kSize / kCell; ++cx) {
                const int kind = int(u(rng) * 3.0f);
                const float rx = kCell * (0.22f + 0.2f * u(rng)),
                            ry = kCell * (0.22f + 0.2f * u(rng));
                const float ox0 = cx * kCell + kCell * 0.5f + (u(rng) - 0.5f) * (kCell - 2 * rx);
                const float oy0 = cy * kCell + kCell * 0.5f + (u(rng) - 0.5f) * (kCell - 2 * ry);
                const ox::Color tint(u(rng) * 4, u(rng) * 4, u(rng) * 4, 1);
                for (int y = cy * kCell; y < (cy + 1) * kCell; ++y)
                    for (int x = cx * kCell; x < (cx + 1) * kCell; ++x) {
                        const float dx = (x + 0.5f - ox0) / rx, dy = (y + 0.5f - oy0) / ry;
                        bool in = false;
                        if (kind == 0) in = dx * dx + dy * dy <= 1.0f;
                        if (kind == 1) in = std::fabs(dx) <= 0.85f && std::fabs(dy) <= 0.85f;
                        if (kind == 2) in = dy >= -1.0f && dy <= 1.0f && std::fabs(dx) <= (1 - dy);
                        if (!in) continue;
                        const size_t i = size_t(y) * kSize + size_t(x);
                        is.z[i] = 1.0f;
                        const float shade = 0.5f + 0.5f * std::sin(0.05f * float(x + y));
                        is.color[i] = ox::Color(tint.r * shade, tint.g * shade, tint.b * shade,
                                                0.5f + 0.5f * u(rng));
                        ++covered;
                    }
            }
        is.coverage = double(covered) / (double(kSize) * kSize);
        return is;
    }();
    return result;
}

std::unique_ptr<ox::Frame> makeFrame() {
    const Islands &is = islands();
    auto f = std::make_unique<ox::Frame>(kSize, kSize);
    f->addTiledLayer<float>("Z")->paste(ox::Region(0, 0, kSize, kSize), is.z.data());
    f->addTiledLayer<ox::Color>("beauty")->paste(ox::Region(0, 0, kSize, kSize), is.color.data());
    return f;
}

/// The island of a texel is its grid cell.
class CellInstances final : public ox::TexelInstanceInterface {
public:
    void instancesOfRow(int32_t y, int32_t width, int32_t *ids) const override {
        for (int32_t x = 0; x < width; ++x) ids[x] = (y / kCell) * (kSize / kCell) + x / kCell;
    }
    int32_t instanceCount() const override { return (kSize / kCell) * (kSize / kCell); }
    std::string instanceName(int32_t i) const override { return "island" + std::to_string(i); }
};

ox::RenderContext &noContext() {
    alignas(16) static char storage[16];
    return *reinterpret_cast<ox::RenderContext *>(storage);
}

/// Argument "threads" 1 and 2, in milliseconds of wall-clock time with the process's CPU time.
void onOneAndTwoThreads(benchmark::internal::Benchmark *b) {
    b->ArgName("threads")
        ->Arg(1)
        ->Arg(2)
        ->Unit(benchmark::kMillisecond)
        ->MeasureProcessCPUTime()
        ->UseRealTime();
}

/// The floor of every filter that replaces a layer: read it in bands, paste into a scratch
/// layer (the storage retired by the previous round), retire the old one and rename the new
/// one.
void BM_LayerReplace(benchmark::State &state) {
    auto frame = makeFrame();
    std::vector<ox::Color> band(size_t(kSize) * ox::kFilterBandRows);
    for (auto _ : state) {
        ox::LayerT<ox::Color> *in = frame->getColorLayer("beauty");
        ox::LayerT<ox::Color> *out = frame->addScratchColorLayer("temp");
        for (int y = 0; y < kSize; y += ox::kFilterBandRows) {
            const ox::Region rows(0, y, kSize, y + ox::kFilterBandRows);
            in->read(rows, band.data());
            out->paste(rows, band.data());
        }
        frame->retireLayer("beauty");
        frame->renameLayer("temp", "beauty");
    }
    state.SetItemsProcessed(int64_t(state.iterations()) * kSize * kSize);
}
BENCHMARK(BM_LayerReplace)->Unit(benchmark::kMillisecond)->MeasureProcessCPUTime()->UseRealTime();

void BM_EdgeDilation(benchmark::State &state) {
    auto frame = makeFrame();
    ox::EdgeDilationFilter filter({"beauty"}, int32_t(state.range(0)), ox::Color(0, 0, 0, 0));
    filter.setThreadCount(int(state.range(1)));
    for (auto _ : state) {
        const bool ok = filter.run(*frame, nullptr);
        if (!ok) state.SkipWithError("dilation failed");
    }
    state.counters["coverage"] = islands().coverage;
    state.SetItemsProcessed(int64_t(state.iterations()) * kSize * kSize);
}
BENCHMARK(BM_EdgeDilation)
    ->ArgNames({"n", "threads"})
    ->Args({5, 1})
    ->Args({5, 2})
    ->Args({32, 1})
    ->Args({32, 2})
    ->Unit(benchmark::kMillisecond)
    ->MeasureProcessCPUTime()
    ->UseRealTime();

/// The chain's other two steps on their own (one frame, filtered again and again).
void BM_Premultiply(benchmark::State &state) {
    auto frame = makeFrame();
    ox::PostFilterCommand premultiply(
        std::make_unique<ox::PremultiplyFilter>(std::vector<std::string>{"beauty"}, 0.0f,
                                                ox::Color(0, 0, 0, 0)),
        int(state.range(0)));
    oxbench::SilentIO io;
    for (auto _ : state)
        if (!premultiply.execute(*frame, noContext(), io)) state.SkipWithError("failed");
    state.SetItemsProcessed(int64_t(state.iterations()) * kSize * kSize);
}
BENCHMARK(BM_Premultiply)->Apply(onOneAndTwoThreads);

void BM_ShapeNormalization(benchmark::State &state) {
    auto frame = makeFrame();
    CellInstances instances;
    ox::ShapeNormalizationFilter normalization("beauty", ox::NormalizeOptions{}, &instances);
    normalization.setThreadCount(int(state.range(0)));
    oxbench::SilentIO io;
    for (auto _ : state)
        if (!normalization.run(*frame, &io)) state.SkipWithError("failed");
    state.SetItemsProcessed(int64_t(state.iterations()) * kSize * kSize);
}
BENCHMARK(BM_ShapeNormalization)->Apply(onOneAndTwoThreads);

void BM_FilterChain(benchmark::State &state) {
    auto frame = makeFrame();
    const int threads = int(state.range(0));
    CellInstances instances;
    ox::PostFilterCommand premultiply(
        std::make_unique<ox::PremultiplyFilter>(std::vector<std::string>{"beauty"}, 0.0f,
                                                ox::Color(0, 0, 0, 0)),
        threads);
    ox::EdgeDilationFilter dilation({"beauty"}, 5, ox::Color(0, 0, 0, 0));
    dilation.setThreadCount(threads);
    ox::ShapeNormalizationFilter normalization("beauty", ox::NormalizeOptions{}, &instances);
    normalization.setThreadCount(threads);
    oxbench::SilentIO io;
    for (auto _ : state) {
        const bool ok = premultiply.execute(*frame, noContext(), io) && dilation.run(*frame, &io) &&
                        normalization.run(*frame, &io);
        if (!ok) state.SkipWithError("chain failed");
    }
    state.counters["coverage"] = islands().coverage;
    state.SetItemsProcessed(int64_t(state.iterations()) * kSize * kSize);
}
BENCHMARK(BM_FilterChain)->Apply(onOneAndTwoThreads);

}  // namespace

BENCHMARK_MAIN();
