// Light-map layout: charts and packing of a finely tessellated sphere, and the packer alone.
#include <benchmark/benchmark.h>

#include <cmath>
#include <numbers>
#include <vector>

#include "tools/lightmap_uv.h"

namespace {

void sphere(int stacks, int slices, std::vector<ox::Vec3> &p, std::vector<uint32_t> &t) {
    const float pi = std::numbers::pi_v<float>;
    for (int i = 0; i <= stacks; ++i)
        for (int j = 0; j <= slices; ++j) {
            float th = pi * float(i) / float(stacks), ph = 2 * pi * float(j) / float(slices);
            p.push_back(
                ox::Vec3(std::sin(th) * std::cos(ph), std::cos(th), std::sin(th) * std::sin(ph)));
        }
    for (int i = 0; i < stacks; ++i)
        for (int j = 0; j < slices; ++j) {
            uint32_t a = uint32_t(i * (slices + 1) + j), b = a + uint32_t(slices + 1);
            t.insert(t.end(), {a, b, a + 1, a + 1, b, b + 1});
        }
}

void BM_LightmapLayoutSphere(benchmark::State &state) {
    std::vector<ox::Vec3> p;
    std::vector<uint32_t> t;
    sphere(int(state.range(0)), 2 * int(state.range(0)), p, t);
    ox::LightmapOptions o;
    o.resolution = 1024;
    ox::LightmapLayout layout;
    for (auto _ : state) {
        bool ok = ox::generateLightmapLayout(p, t, o, layout);
        benchmark::DoNotOptimize(ok);
    }
    state.counters["triangles"] = double(t.size() / 3);
    state.counters["charts"] = layout.chartCount;
    state.counters["coverage"] = layout.coverage;
    state.SetItemsProcessed(int64_t(state.iterations()) * int64_t(t.size() / 3));
}
BENCHMARK(BM_LightmapLayoutSphere)->Arg(32)->Arg(100)->Unit(benchmark::kMillisecond);

void BM_PackRectangles(benchmark::State &state) {
    std::vector<ox::PackRect> rects;
    for (int i = 0; i < state.range(0); ++i)
        rects.push_back({float(1 + (i * 7) % 13), float(1 + (i * 5) % 11), 0, 0});
    for (auto _ : state) {
        bool ok = ox::packRectangles(rects, 0.5f, 4096, 2);
        benchmark::DoNotOptimize(ok);
    }
    state.SetItemsProcessed(int64_t(state.iterations()) * state.range(0));
}
BENCHMARK(BM_PackRectangles)->Arg(100)->Arg(2000);

}  // namespace

BENCHMARK_MAIN();
