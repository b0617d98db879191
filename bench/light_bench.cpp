// Shadowed illumination against the bare occlusion queries it makes: a point light (one shadow
// ray per call) and an area light (16 stratified rays per call) over the 870k-triangle blob of the
// ray-tracing benchmark, one and two threads. The shading points lie just outside the blob's
// surface; the lights hang above it. The bare benchmarks replay exactly the rays that the
// illuminate calls traced (recorded once), so the difference is the cost of the light code.
#include <benchmark/benchmark.h>

#include <ctime>
#include <memory>
#include <vector>

#include "core/message.h"
#include "core/random.h"
#include "raytrace/complete_grid.h"
#include "shading/light.h"
#include "tests/raytrace/test_meshes.h"

namespace {

using namespace ox;

constexpr size_t kPointCount = 1 << 14;

// Passes the queries on to the grid and keeps every occlusion ray it is asked.
class RecordingADS final : public ADSInterface {
public:
    struct Query {
        Ray ray;
        float tmax;
    };
    explicit RecordingADS(const ADSInterface &inner) : inner_(inner) {}
    bool intersect(const Ray &r, Hit &h, float tmax, RayCounter *c) const override {
        return inner_.intersect(r, h, tmax, c);
    }
    using ADSInterface::intersect;
    bool intersectSecond(const Ray &r, Hit &h, float tmax, RayCounter *c) const override {
        return inner_.intersectSecond(r, h, tmax, c);
    }
    BBox bounds() const override { return inner_.bounds(); }
    bool occluded(const Ray &r, float tmax, RayCounter *c) const override {
        queries.push_back({r, tmax});
        return inner_.occluded(r, tmax, c);
    }
    mutable std::vector<Query> queries;

private:
    const ADSInterface &inner_;
};

struct Fixture {
    testmesh::Mesh mesh;
    CompleteGrid grid;
    ShadowTracer tracer;
    std::vector<Vec3> points, normals;
    std::unique_ptr<LightSource> lights[2];
    // The rays each light's calls traced over all points with the generator of thread 0.
    std::vector<RecordingADS::Query> rays[2];

    Fixture() {
        setTypeEnabled(kMsgProgress | kMsgInfo | kMsgBench | kMsgVerbose, false);
        mesh = testmesh::blob(466, 935);  // 869,550 triangles
        const InstanceInput in = testmesh::instanceOf(mesh, "blob");
        grid.build({in}, ADSParameters());
        const BBox box = grid.bounds();
        tracer.ads = &grid;
        tracer.bias = box.extent().length() * 1e-5f;

        // Points just outside the surface (pushed out from the centre), spread over the mesh.
        testmesh::Rng rng(777);
        for (size_t i = 0; i < kPointCount; ++i) {
            const Vec3 &v = mesh.positions[rng.next() % mesh.positions.size()];
            points.push_back(v * 1.002f);
            normals.push_back(v.normalized());
        }

        LightParameters p;
        p.name = "point";
        p.color = Color(1, 1, 1, 1);
        p.type = LightType::kPoint;
        p.objectToWorld = Mtx4::translation({0.2f, 3.0f, 0.1f});
        bool shadows = false;
        lights[0] = createLight(p, shadows);
        // A 1 x 1 square at the same place, facing down, 16 samples.
        p.name = "area";
        p.type = LightType::kArea;
        p.shadowSamples = 16;
        Mtx4 m;
        m.m[0][0] = 0.5f, m.m[1][1] = 0, m.m[1][2] = 0.5f, m.m[2][1] = -1, m.m[2][2] = 0;
        m.m[3][0] = 0.2f, m.m[3][1] = 3.0f, m.m[3][2] = 0.1f;
        p.objectToWorld = m;
        lights[1] = createLight(p, shadows);

        for (int l = 0; l < 2; ++l) {
            RecordingADS recorder(grid);
            ShadowTracer recording = tracer;
            recording.ads = &recorder;
            Random random(threadSeed(0));
            LightContext ctx = context(&recording, &random, nullptr);
            for (size_t i = 0; i < kPointCount; ++i)
                lights[l]->illuminate(points[i], normals[i], ctx, true);
            rays[l] = std::move(recorder.queries);
        }
    }

    static uint64_t threadSeed(int thread) { return 1234 + uint64_t(thread); }
    static LightContext context(const ShadowTracer *t, Random *random, RayCounter *counter) {
        LightContext ctx;
        ctx.tracer = t;
        ctx.random = random;
        ctx.counter = counter;
        return ctx;
    }
};

Fixture &fixture() {
    static Fixture f;
    return f;
}

// Shadowed illuminate calls. Argument: light (0 point, 1 area). Counters: calls per second
// (items) and shadow rays per second.
void BM_Illuminate(benchmark::State &state) {
    Fixture &f = fixture();
    const LightSource &light = *f.lights[state.range(0)];
    Random random(Fixture::threadSeed(state.thread_index()));
    RayCounter counter;
    LightContext ctx = Fixture::context(&f.tracer, &random, &counter);
    size_t i = size_t(state.thread_index()) * 7919, n = 0;
    float sum = 0;
    for (auto _ : state) {
        for (int k = 0; k < 64; ++k, ++i) {
            const size_t at = i & (kPointCount - 1);
            sum += light.illuminate(f.points[at], f.normals[at], ctx, true).r;
        }
        n += 64;
    }
    benchmark::DoNotOptimize(sum);
    state.SetItemsProcessed(int64_t(n));
    state.counters["shadowRays"] =
        benchmark::Counter(double(counter.count(kRayShadow)), benchmark::Counter::kIsRate);
    state.counters["lit"] = sum / double(n ? n : 1);
}

// The same rays as bare occlusion queries on the grid. Argument: light. Items: rays.
void BM_BareOcclusion(benchmark::State &state) {
    Fixture &f = fixture();
    const std::vector<RecordingADS::Query> &rays = f.rays[state.range(0)];
    size_t i = size_t(state.thread_index()) * 7919, n = 0, hits = 0;
    RayCounter counter;
    for (auto _ : state) {
        for (int k = 0; k < 256; ++k, ++i) {
            const RecordingADS::Query &q = rays[i % rays.size()];
            hits += f.grid.occluded(q.ray, q.tmax, &counter);
        }
        n += 256;
    }
    state.SetItemsProcessed(int64_t(n));
    state.counters["hitRate"] = double(hits) / double(n ? n : 1);
}

double threadSeconds() {
    timespec ts;
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &ts);
    return double(ts.tv_sec) + 1e-9 * double(ts.tv_nsec);
}

// Illuminate and the bare queries in turns over the same points and rays on one thread, timed
// by the thread's CPU clock so that the ratio survives a busy machine. Argument: light.
// Counters: rays per CPU second of both and their ratio (1.0 = no shading overhead).
void BM_Overhead(benchmark::State &state) {
    Fixture &f = fixture();
    const int l = int(state.range(0));
    const LightSource &light = *f.lights[l];
    const std::vector<RecordingADS::Query> &rays = f.rays[l];
    constexpr size_t kTurn = 2048;
    double lightSeconds = 0, bareSeconds = 0;
    uint64_t lightRays = 0, bareRays = 0;
    float sum = 0;
    for (auto _ : state) {
        // Every turn starts from the first point with the recording's generator, so the recorded
        // rays are exactly the rays these calls trace.
        Random random(Fixture::threadSeed(0));
        RayCounter counter;
        LightContext ctx = Fixture::context(&f.tracer, &random, &counter);
        double t0 = threadSeconds();
        for (size_t k = 0; k < kTurn; ++k)
            sum += light.illuminate(f.points[k], f.normals[k], ctx, true).r;
        double t1 = threadSeconds();
        const size_t count = size_t(counter.count(kRayShadow));
        size_t hits = 0;
        double t2 = threadSeconds();
        for (size_t k = 0; k < count; ++k)
            hits += f.grid.occluded(rays[k].ray, rays[k].tmax, nullptr);
        double t3 = threadSeconds();
        benchmark::DoNotOptimize(hits);
        lightSeconds += t1 - t0;
        bareSeconds += t3 - t2;
        lightRays += count;
        bareRays += count;
    }
    benchmark::DoNotOptimize(sum);
    state.counters["illuminateRaysPerCpuSecond"] = double(lightRays) / lightSeconds;
    state.counters["bareRaysPerCpuSecond"] = double(bareRays) / bareSeconds;
    state.counters["ratio"] = bareSeconds / lightSeconds;
}

}  // namespace

BENCHMARK(BM_Illuminate)->ArgName("area")->Arg(0)->Arg(1)->Threads(1)->Threads(2)->UseRealTime();
BENCHMARK(BM_BareOcclusion)->ArgName("area")->Arg(0)->Arg(1)->Threads(1)->Threads(2)->UseRealTime();
BENCHMARK(BM_Overhead)->ArgName("area")->Arg(0)->Arg(1);
BENCHMARK_MAIN();
