// The image sampler's own cost: a 256 x 256 image of a disc over a smooth background, whose
// shading costs next to nothing, so the time is the sampler's (lattice, refinement, edge probes
// and filtering). Counters: image samples and probes per second, samples per pixel.
#include <benchmark/benchmark.h>

#include <cmath>
#include <vector>

#include "render/image_sampler.h"

namespace {

struct DiscShader {
    ox::ImageSample shade(float x, float y, ox::Vec2, float) const {
        const float dx = x - 128.0f, dy = y - 128.0f;
        if (dx * dx + dy * dy < 90.0f * 90.0f) return {ox::Color(1, 0.5f, 0.25f, 1), 1.0f, 1};
        const float v = 0.5f + 0.25f * std::sin(x * 0.05f) * std::cos(y * 0.03f);
        return {ox::Color(v, v, v, 1), 2.0f, 0};
    }
    int32_t object(float x, float y) const {
        const float dx = x - 128.0f, dy = y - 128.0f;
        return dx * dx + dy * dy < 90.0f * 90.0f ? 1 : 0;
    }
};

// Arguments: sampling mode (1 Adaptive, 2 SuperSampling), minimum rate, maximum rate, filter.
void BM_Sampler(benchmark::State &state) {
    ox::ImageSamplerSettings s;
    s.samplingMode = int32_t(state.range(0));
    s.minSampleRate = int32_t(state.range(1));
    s.maxSampleRate = int32_t(state.range(2));
    s.filter = int32_t(state.range(3));
    s.filterSize = s.filter == 0 ? ox::Vec2{1.0f, 1.0f} : ox::Vec2{2.0f, 2.0f};
    const auto sampler = ox::createImageSampler(s);
    DiscShader shader;
    ox::ImageSampler::Scratch scratch;
    std::vector<ox::Color> beauty(32 * 32);
    std::vector<float> depth(32 * 32);
    for (auto _ : state)
        for (uint32_t ty = 0; ty < 256; ty += 32)
            for (uint32_t tx = 0; tx < 256; tx += 32) {
                sampler->renderTile(tx, tx + 31, ty, ty + 31, shader, scratch, beauty.data(),
                                    depth.data());
                benchmark::DoNotOptimize(beauty.data());
            }
    const auto &c = scratch.counters;
    state.counters["samples/s"] =
        benchmark::Counter(double(c.samples), benchmark::Counter::kIsRate);
    state.counters["probes/s"] = benchmark::Counter(double(c.probes), benchmark::Counter::kIsRate);
    state.counters["samplesPerPixel"] = double(c.samples) / double(c.pixels ? c.pixels : 1);
}

BENCHMARK(BM_Sampler)
    ->ArgNames({"mode", "min", "max", "filter"})
    ->Args({2, 0, 0, 0})
    ->Args({2, 2, 2, 0})
    ->Args({2, 0, 2, 0})
    ->Args({2, 2, 2, 6})
    ->Args({1, -2, 0, 0})
    ->Args({1, -2, 2, 3})
    ->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
