// Rays per second of the complete grid against Intel Embree on the same meshes and rays:
// incoherent rays (random origins inside the scene box, random directions) and camera rays,
// closest hit and occlusion, one and two threads, over meshes of about 70k and 870k triangles.
// The build benchmarks report the build time and the bytes per triangle of both structures.
#include <benchmark/benchmark.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cmath>
#include <ctime>
#include <memory>
#include <vector>

#include "core/message.h"
#include "raytrace/camera.h"
#include "raytrace/complete_grid.h"
#include "tests/raytrace/test_meshes.h"

#ifdef OX_HAVE_EMBREE
#include <embree3/rtcore.h>
#endif

namespace {

using namespace ox;

constexpr size_t kRayCount = 1 << 16;

// CPU seconds of the whole process: builds are timed by it as well as by the wall clock, so that
// they compare on a machine shared with other work (each build runs alone in the process).
double processSeconds() {
    timespec ts;
    clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &ts);
    return double(ts.tv_sec) + 1e-9 * double(ts.tv_nsec);
}

#ifdef OX_HAVE_EMBREE
std::atomic<int64_t> gEmbreeBytes{0};
bool embreeMemory(void *, ssize_t bytes, bool) {
    gEmbreeBytes += bytes;
    return true;
}

struct EmbreeScene {
    RTCDevice device = nullptr;
    RTCScene scene = nullptr;
    double buildSeconds = 0, buildCpuSeconds = 0;
    int64_t bytes = 0;

    explicit EmbreeScene(const testmesh::Mesh &m) {
        device = rtcNewDevice("threads=1");
        rtcSetDeviceMemoryMonitorFunction(device, embreeMemory, nullptr);
        int64_t before = gEmbreeBytes;
        double cpuStart = processSeconds();
        auto start = std::chrono::steady_clock::now();
        scene = rtcNewScene(device);
        RTCGeometry g = rtcNewGeometry(device, RTC_GEOMETRY_TYPE_TRIANGLE);
        auto *v = static_cast<float *>(rtcSetNewGeometryBuffer(g, RTC_BUFFER_TYPE_VERTEX, 0,
                                                               RTC_FORMAT_FLOAT3, 3 * sizeof(float),
                                                               m.positions.size()));
        for (size_t i = 0; i < m.positions.size(); ++i)
            v[3 * i] = m.positions[i].x, v[3 * i + 1] = m.positions[i].y,
                  v[3 * i + 2] = m.positions[i].z;
        auto *ix = static_cast<unsigned *>(
            rtcSetNewGeometryBuffer(g, RTC_BUFFER_TYPE_INDEX, 0, RTC_FORMAT_UINT3,
                                    3 * sizeof(unsigned), m.triangleCount()));
        for (size_t i = 0; i < m.indices.size(); ++i) ix[i] = m.indices[i];
        rtcCommitGeometry(g);
        rtcAttachGeometry(scene, g);
        rtcReleaseGeometry(g);
        rtcCommitScene(scene);
        buildSeconds =
            std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
        buildCpuSeconds = processSeconds() - cpuStart;
        bytes = gEmbreeBytes - before;
    }
    ~EmbreeScene() {
        rtcReleaseScene(scene);
        rtcReleaseDevice(device);
    }
};
#endif

#ifdef OX_HAVE_EMBREE
// One Embree query as the grid answers it: closest hit without limit, or any hit below tmax.
bool embreeQuery(RTCScene scene, const Ray &r, float tmax, bool any) {
    RTCIntersectContext ctx;
    rtcInitIntersectContext(&ctx);
    RTCRayHit rh;
    rh.ray.org_x = r.origin.x, rh.ray.org_y = r.origin.y, rh.ray.org_z = r.origin.z;
    rh.ray.dir_x = r.direction.x, rh.ray.dir_y = r.direction.y, rh.ray.dir_z = r.direction.z;
    rh.ray.tnear = 1e-6f;
    rh.ray.tfar = any ? tmax : 3.4028235e38f;
    rh.ray.mask = 0xFFFFFFFFu;
    rh.ray.flags = 0;
    rh.ray.time = 0;
    if (any) {
        rtcOccluded1(scene, &ctx, &rh.ray);
        return rh.ray.tfar < 0.0f;
    }
    rh.hit.geomID = RTC_INVALID_GEOMETRY_ID;
    rtcIntersect1(scene, &ctx, &rh);
    return rh.hit.geomID != RTC_INVALID_GEOMETRY_ID;
}
#endif

struct Fixture {
    testmesh::Mesh mesh;
    CompleteGrid grid;
    double buildSeconds = 0, buildCpuSeconds = 0;
    std::vector<Ray> incoherent, camera;
    float incoherentTmax = 0, cameraTmax = 0;
#ifdef OX_HAVE_EMBREE
    std::unique_ptr<EmbreeScene> embree;
#endif

    explicit Fixture(uint32_t rings, uint32_t segments) {
        setTypeEnabled(kMsgProgress | kMsgInfo | kMsgBench | kMsgVerbose, false);
        mesh = testmesh::blob(rings, segments);
        const InstanceInput in = testmesh::instanceOf(mesh, "blob");
        double cpuStart = processSeconds();
        auto start = std::chrono::steady_clock::now();
        grid.build({in}, ADSParameters());
        buildSeconds =
            std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
        buildCpuSeconds = processSeconds() - cpuStart;
        testmesh::Rng rng(12345);
        BBox box = grid.bounds();
        incoherentTmax = box.extent().length() * 0.25f;
        for (size_t i = 0; i < kRayCount; ++i) {
            Ray r;
            r.origin = rng.inBox(box);
            r.direction = rng.direction();
            incoherent.push_back(r);
        }
        Mtx4 m = Mtx4::translation({0.3f, 0.4f, 4.0f});
        PerspectiveCamera cam("cam", m, nullptr, 0.8f, 0.8f, {0, 0});
        for (size_t y = 0; y < 256; ++y)
            for (size_t x = 0; x < 256; ++x) {
                Ray r;
                cam.generateRay({(x + 0.5f) / 256.0f, (y + 0.5f) / 256.0f}, {0.5f, 0.5f}, r);
                camera.push_back(r);
            }
        cameraTmax = 4.0f;
#ifdef OX_HAVE_EMBREE
        embree = std::make_unique<EmbreeScene>(mesh);
#endif
    }
};

// Built on first use; the threads of a multi-threaded benchmark may ask at the same time.
Fixture &fixture(int which) {
    if (which == 0) {
        static Fixture small(133, 265);  // 69,960 triangles
        return small;
    }
    static Fixture large(466, 935);  // 869,550 triangles
    return large;
}

// Arguments: mesh (0 small, 1 large), rays (0 incoherent, 1 camera), query (0 closest, 1 any).
void BM_Grid(benchmark::State &state) {
    Fixture &f = fixture(int(state.range(0)));
    const std::vector<Ray> &rays = state.range(1) == 0 ? f.incoherent : f.camera;
    float tmax = state.range(1) == 0 ? f.incoherentTmax : f.cameraTmax;
    bool any = state.range(2) == 1;
    size_t i = size_t(state.thread_index()) * 7919, hits = 0, n = 0;
    RayCounter counter;
    for (auto _ : state) {
        for (int k = 0; k < 256; ++k, ++i) {
            const Ray &r = rays[i & (rays.size() - 1)];
            if (any) {
                hits += f.grid.occluded(r, tmax, &counter);
            } else {
                Hit h;
                hits += f.grid.intersect(r, h, &counter);
            }
        }
        n += 256;
    }
    state.SetItemsProcessed(int64_t(n));
    state.counters["hitRate"] = double(hits) / double(n ? n : 1);
}

// Every ray of the set once per iteration (one iteration): for instruction counts under a
// simulator, e.g. valgrind --tool=callgrind --toggle-collect='*gridPass*', which do not depend on
// the machine's load. Arguments as BM_Grid.
__attribute__((noinline)) size_t gridPass(const CompleteGrid &grid, const std::vector<Ray> &rays,
                                          float tmax, bool any) {
    size_t hits = 0;
    for (const Ray &r : rays) {
        if (any) {
            hits += grid.occluded(r, tmax, nullptr);
        } else {
            Hit h;
            hits += grid.intersect(r, h, nullptr);
        }
    }
    return hits;
}

void BM_GridPass(benchmark::State &state) {
    Fixture &f = fixture(int(state.range(0)));
    const std::vector<Ray> &rays = state.range(1) == 0 ? f.incoherent : f.camera;
    float tmax = state.range(1) == 0 ? f.incoherentTmax : f.cameraTmax;
    size_t hits = 0, n = 0;
    for (auto _ : state) {
        hits += gridPass(f.grid, rays, tmax, state.range(2) == 1);
        n += rays.size();
    }
    state.SetItemsProcessed(int64_t(n));
    state.counters["hitRate"] = double(hits) / double(n ? n : 1);
}

#ifdef OX_HAVE_EMBREE
void BM_Embree(benchmark::State &state) {
    Fixture &f = fixture(int(state.range(0)));
    const std::vector<Ray> &rays = state.range(1) == 0 ? f.incoherent : f.camera;
    float tmax = state.range(1) == 0 ? f.incoherentTmax : f.cameraTmax;
    bool any = state.range(2) == 1;
    RTCScene scene = f.embree->scene;
    size_t i = size_t(state.thread_index()) * 7919, hits = 0, n = 0;
    for (auto _ : state) {
        for (int k = 0; k < 256; ++k, ++i)
            hits += embreeQuery(scene, rays[i & (rays.size() - 1)], tmax, any);
        n += 256;
    }
    state.SetItemsProcessed(int64_t(n));
    state.counters["hitRate"] = double(hits) / double(n ? n : 1);
}
#endif

#ifdef OX_HAVE_EMBREE
double threadSeconds() {
    timespec ts;
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &ts);
    return double(ts.tv_sec) + 1e-9 * double(ts.tv_nsec);
}

// The grid and Embree in turns over the same rays on one thread, timed by the thread's CPU
// clock, so that the ratio stays meaningful on a machine shared with other work. Each turn first
// warms its structure with 16k other rays, so that neither is timed with caches the other one
// filled. Arguments as BM_Grid; counters: gridRaysPerCpuSecond, embreeRaysPerCpuSecond, ratio.
void ratioTurns(benchmark::State &state, Fixture &f, const std::vector<Ray> &rays, float tmax,
                bool any) {
    constexpr size_t kTurn = 16384;
    auto gridRun = [&](size_t start, std::vector<char> &hits) {
        for (size_t k = 0; k < kTurn; ++k) {
            const Ray &r = rays[(start + k) & (rays.size() - 1)];
            Hit h;
            hits[k] = any ? f.grid.occluded(r, tmax, nullptr) : f.grid.intersect(r, h, nullptr);
        }
    };
    auto embreeRun = [&](size_t start, std::vector<char> &hits) {
        for (size_t k = 0; k < kTurn; ++k)
            hits[k] =
                embreeQuery(f.embree->scene, rays[(start + k) & (rays.size() - 1)], tmax, any);
    };
    double gridSeconds = 0, embreeSeconds = 0;
    size_t n = 0, mismatches = 0, turn = 0;
    std::vector<char> gridHits(kTurn), embreeHits(kTurn), warm(kTurn);
    for (auto _ : state) {
        size_t start = (turn++ * 2 * kTurn) & (rays.size() - 1);
        gridRun(start + kTurn, warm);
        double t0 = threadSeconds();
        gridRun(start, gridHits);
        double t1 = threadSeconds();
        embreeRun(start + kTurn, warm);
        double t2 = threadSeconds();
        embreeRun(start, embreeHits);
        double t3 = threadSeconds();
        gridSeconds += t1 - t0;
        embreeSeconds += t3 - t2;
        for (size_t k = 0; k < kTurn; ++k) mismatches += gridHits[k] != embreeHits[k];
        n += kTurn;
    }
    state.SetItemsProcessed(int64_t(n));
    state.counters["gridRaysPerCpuSecond"] = double(n) / gridSeconds;
    state.counters["embreeRaysPerCpuSecond"] = double(n) / embreeSeconds;
    state.counters["ratio"] = embreeSeconds / gridSeconds;
    state.counters["hitMismatches"] = double(mismatches);
}

void BM_Ratio(benchmark::State &state) {
    Fixture &f = fixture(int(state.range(0)));
    ratioTurns(state, f, state.range(1) == 0 ? f.incoherent : f.camera,
               state.range(1) == 0 ? f.incoherentTmax : f.cameraTmax, state.range(2) == 1);
}

// BM_Ratio over one class of the rays, repeated to the set's size: those that miss the grid's
// box (class 0), those that enter it and hit nothing (1), and those that hit (2). Where the two
// structures differ most shows which part of a query to work on.
void BM_RatioByClass(benchmark::State &state) {
    Fixture &f = fixture(int(state.range(0)));
    const std::vector<Ray> &all = state.range(1) == 0 ? f.incoherent : f.camera;
    const float tmax = state.range(1) == 0 ? f.incoherentTmax : f.cameraTmax;
    const bool any = state.range(2) == 1;
    const BBox box = f.grid.bounds();
    std::vector<Ray> rays;
    for (const Ray &r : all) {
        float t0 = 0.0f, t1 = tmax;
        for (int a = 0; a < 3; ++a) {
            const float inv = 1.0f / r.direction[a];
            float ta = (box.min[a] - r.origin[a]) * inv, tb = (box.max[a] - r.origin[a]) * inv;
            if (ta > tb) std::swap(ta, tb);
            t0 = std::max(t0, ta), t1 = std::min(t1, tb);
        }
        Hit h;
        const bool hit = any ? f.grid.occluded(r, tmax, nullptr) : f.grid.intersect(r, h, nullptr);
        if ((t0 <= t1 ? (hit ? 2 : 1) : 0) == state.range(3)) rays.push_back(r);
    }
    state.counters["classShare"] = double(rays.size()) / double(all.size());
    if (rays.empty()) {
        state.SkipWithError("no ray of this class");
        return;
    }
    for (size_t i = 0; rays.size() < all.size(); ++i) rays.push_back(rays[i]);
    ratioTurns(state, f, rays, tmax, any);
}
#endif

void BM_Build(benchmark::State &state) {
    Fixture &f = fixture(int(state.range(0)));
    for (auto _ : state) benchmark::DoNotOptimize(f.grid.bounds());
    double tris = double(f.mesh.triangleCount());
    state.counters["triangles"] = tris;
    state.counters["gridBuildSeconds"] = f.buildSeconds;
    state.counters["gridBuildCpuSeconds"] = f.buildCpuSeconds;
    state.counters["gridBytesPerTriangle"] = double(f.grid.sizeBytes()) / tris;
#ifdef OX_HAVE_EMBREE
    state.counters["embreeBuildSeconds"] = f.embree->buildSeconds;
    state.counters["embreeBuildCpuSeconds"] = f.embree->buildCpuSeconds;
    state.counters["buildCpuRatio"] = f.buildCpuSeconds / f.embree->buildCpuSeconds;
    state.counters["embreeBytesPerTriangle"] = double(f.embree->bytes) / tris;
#endif
}

// The grid's build alone, repeated on a fresh structure each iteration (CPU time column): the
// one-shot BM_Build figure of the small mesh is too short to compare changes by. Argument: mesh.
void BM_GridBuild(benchmark::State &state) {
    setTypeEnabled(kMsgProgress | kMsgInfo | kMsgBench | kMsgVerbose, false);
    const testmesh::Mesh mesh =
        state.range(0) == 0 ? testmesh::blob(133, 265) : testmesh::blob(466, 935);
    const InstanceInput in = testmesh::instanceOf(mesh, "blob");
    const std::vector<InstanceInput> instances{in};
    for (auto _ : state) {
        CompleteGrid grid;
        grid.build(instances, ADSParameters());
        benchmark::DoNotOptimize(grid.sizeBytes());
    }
    state.counters["triangles"] = double(mesh.triangleCount());
}

void rayArgs(benchmark::internal::Benchmark *b) {
    b->ArgNames({"mesh", "camera", "occlusion"});
    for (int mesh : {0, 1})
        for (int rays : {0, 1})
            for (int any : {0, 1}) b->Args({mesh, rays, any});
    b->Threads(1)->Threads(2)->UseRealTime();
}

}  // namespace

BENCHMARK(BM_Build)->Arg(0)->Arg(1)->Iterations(1);
BENCHMARK(BM_GridBuild)->Arg(0)->Arg(1)->Unit(benchmark::kMillisecond);
BENCHMARK(BM_Grid)->Apply(rayArgs);
BENCHMARK(BM_GridPass)
    ->ArgNames({"mesh", "camera", "occlusion"})
    ->ArgsProduct({{0, 1}, {0, 1}, {0, 1}})
    ->Iterations(1);
#ifdef OX_HAVE_EMBREE
BENCHMARK(BM_Embree)->Apply(rayArgs);
BENCHMARK(BM_Ratio)
    ->ArgNames({"mesh", "camera", "occlusion"})
    ->ArgsProduct({{0, 1}, {0, 1}, {0, 1}});
// Incoherent rays start inside the box: they have no class 0.
BENCHMARK(BM_RatioByClass)
    ->ArgNames({"mesh", "camera", "occlusion", "class"})
    ->Apply([](benchmark::internal::Benchmark *b) {
        for (int mesh : {0, 1})
            for (int rays : {0, 1})
                for (int any : {0, 1})
                    for (int cls = rays == 0 ? 1 : 0; cls < 3; ++cls)
                        b->Args({mesh, rays, any, cls});
    });
#endif
BENCHMARK_MAIN();
