// Loading and building one large shape from a temporary mesh file: triangles per second on one
// thread and the peak heap per triangle while the shape is built.
#include <benchmark/benchmark.h>
#include <unistd.h>

#include <atomic>
#include <cstdlib>
#include <new>
#include <string>

#include "scene/temp_shape.h"
#include "scene/vtm.h"

namespace {

// Heap accounting for this program: every plain allocation carries its size in front of it.
std::atomic<int64_t> gLive{0}, gPeak{0};
constexpr size_t kHeader = 16;

void *countedAlloc(size_t n) {
    void *p = std::malloc(n + kHeader);
    if (!p) throw std::bad_alloc();
    *static_cast<size_t *>(p) = n;
    int64_t live = gLive.fetch_add(int64_t(n)) + int64_t(n);
    int64_t peak = gPeak.load();
    while (live > peak && !gPeak.compare_exchange_weak(peak, live)) {
    }
    return static_cast<char *>(p) + kHeader;
}

void countedFree(void *p) {
    if (!p) return;
    char *base = static_cast<char *>(p) - kHeader;
    gLive.fetch_sub(int64_t(*reinterpret_cast<size_t *>(base)));
    std::free(base);
}

}  // namespace

void *operator new(size_t n) { return countedAlloc(n); }
void *operator new[](size_t n) { return countedAlloc(n); }
void operator delete(void *p) noexcept { countedFree(p); }
void operator delete[](void *p) noexcept { countedFree(p); }
void operator delete(void *p, size_t) noexcept { countedFree(p); }
void operator delete[](void *p, size_t) noexcept { countedFree(p); }

namespace {

struct AnyMaterial : ox::ShapeMaterialResolverInterface {
    const ox::Material *resolve(const std::string &, const std::vector<std::string> &) override {
        return reinterpret_cast<const ox::Material *>(0x10);
    }
};

// A gently curved grid of w x h quads with one UV set. shared: neighbouring quads share their
// vertices (about 0.5 vertices per triangle); otherwise every triangle has its own three, as
// many exporters write them, and welding has to find the neighbours.
std::string makeMesh(uint32_t w, uint32_t h, bool shared) {
    std::string path =
        "/tmp/ox_mesh_bench_" + std::to_string(getpid()) + (shared ? "_shared.vtm" : "_soup.vtm");
    auto writer = vtm::createWriter(path, 2);
    if (!writer) return {};
    const uint64_t tris = uint64_t(w) * h * 2;
    const uint32_t verts = shared ? (w + 1) * (h + 1) : uint32_t(tris * 3);
    writer->setShapeName("bench");
    writer->setVertexCount(verts);
    writer->setUvSetNames({"map1"});
    writer->setGroups({{"m", uint32_t(tris)}});
    writer->setBounds(ox::BBox(ox::Vec3(0, 0, -1), ox::Vec3(float(w), float(h), 1)));
    writer->writeHeader();
    auto vertex = [&](uint32_t x, uint32_t y) {
        float z = 0.5f * std::sin(x * 0.01f) * std::cos(y * 0.013f);
        float rec[12] = {float(x), float(y), z, 0, 0, 1, 0, 0, 0, 0, 0, 0};
        float uv[2] = {x / float(w), y / float(h)};
        writer->writeVertex(rec);
        writer->writeUV(uv);
    };
    if (shared) {
        for (uint32_t y = 0; y <= h; ++y)
            for (uint32_t x = 0; x <= w; ++x) vertex(x, y);
        for (uint32_t y = 0; y < h; ++y)
            for (uint32_t x = 0; x < w; ++x) {
                uint32_t a = y * (w + 1) + x, b = a + 1, c = a + w + 1, d = c + 1;
                uint32_t t0[3] = {a, b, d}, t1[3] = {a, d, c};
                writer->writeTriangle(t0);
                writer->writeTriangle(t1);
            }
    } else {
        for (uint32_t y = 0; y < h; ++y)
            for (uint32_t x = 0; x < w; ++x) {
                vertex(x, y), vertex(x + 1, y), vertex(x + 1, y + 1);
                vertex(x, y), vertex(x + 1, y + 1), vertex(x, y + 1);
            }
        for (uint32_t t = 0; t < tris; ++t) {
            uint32_t idx[3] = {3 * t, 3 * t + 1, 3 * t + 2};
            writer->writeTriangle(idx);
        }
    }
    return writer->commit() ? path : std::string();
}

void buildShape(benchmark::State &state, bool shared) {
    const uint32_t w = 708, h = 707;  // 1,001,112 triangles
    const std::string path = makeMesh(w, h, shared);
    if (path.empty()) {
        state.SkipWithError("cannot write the mesh file");
        return;
    }
    AnyMaterial materials;
    uint64_t triangles = 0;
    int64_t peakBytes = 0;
    for (auto _ : state) {
        const int64_t before = gLive.load();
        gPeak.store(before);
        auto reader = vtm::TempMeshReaderFactory::instance().open(path);
        std::unique_ptr<ox::Shape> shape;
        std::string failure;
        if (!reader || ox::buildTempShape(*reader, materials, {}, shape, failure) !=
                           ox::ShapeBuildStatus::kBuilt) {
            state.SkipWithError("build failed");
            break;
        }
        reader.reset();
        triangles = shape->triangleCount();
        peakBytes = std::max(peakBytes, gPeak.load() - before);
        benchmark::DoNotOptimize(shape.get());
        state.counters["vertices"] = double(shape->vertices().size());
        state.counters["final_bytes_per_tri"] =
            double(shape->memoryBytes()) / double(triangles ? triangles : 1);
    }
    std::remove(path.c_str());
    state.counters["triangles"] = double(triangles);
    state.counters["tris_per_s"] =
        benchmark::Counter(double(triangles), benchmark::Counter::kIsIterationInvariantRate);
    state.counters["peak_bytes_per_tri"] = double(peakBytes) / double(triangles ? triangles : 1);
}

void BM_BuildSharedMesh1M(benchmark::State &state) { buildShape(state, true); }
void BM_BuildTriangleSoup1M(benchmark::State &state) { buildShape(state, false); }

BENCHMARK(BM_BuildSharedMesh1M)->Unit(benchmark::kMillisecond)->Iterations(3);
BENCHMARK(BM_BuildTriangleSoup1M)->Unit(benchmark::kMillisecond)->Iterations(3);

}  // namespace

BENCHMARK_MAIN();
