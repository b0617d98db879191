// Phong `shade` calls per second: a textured material (diffuse texture with EWA lookups, a
// specular highlight) lit by one point light, over a floor below a 50k-triangle blob that
// casts the shadows. Argument: shadow rays per light (0 = no shadows, 1, 16). One and two
// threads; the counter shadePerCpuSecond is per thread, timed by the thread's CPU clock so that
// it stays meaningful on a shared machine.
#include <benchmark/benchmark.h>

#include <cstdio>
#include <ctime>
#include <memory>
#include <string>
#include <vector>

#include "core/message.h"
#include "core/random.h"
#include "raytrace/complete_grid.h"
#include "shading/light.h"
#include "shading/pass.h"
#include "shading/phong.h"
#include "tests/raytrace/test_meshes.h"

namespace {

using namespace ox;

double threadSeconds() {
    timespec ts;
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &ts);
    return double(ts.tv_sec) + 1e-9 * double(ts.tv_nsec);
}

// A 256 x 256 checkerboard TGA in the temporary directory.
std::string checkerFile() {
    const std::string path = "/tmp/thevorn_shade_bench_checker.tga";
    const int n = 256;
    std::vector<uint8_t> f(18, 0);
    f[2] = 2, f[12] = uint8_t(n), f[13] = uint8_t(n >> 8), f[14] = uint8_t(n),
    f[15] = uint8_t(n >> 8), f[16] = 24;
    for (int y = 0; y < n; ++y)
        for (int x = 0; x < n; ++x) {
            const uint8_t v = ((x / 16) ^ (y / 16)) & 1 ? 230 : 40;
            f.insert(f.end(), {v, uint8_t(v / 2), uint8_t(255 - v)});
        }
    FILE *out = std::fopen(path.c_str(), "wb");
    if (out) {
        std::fwrite(f.data(), 1, f.size(), out);
        std::fclose(out);
    }
    return path;
}

struct Fixture {
    testmesh::Mesh blob = testmesh::blob(160, 160, 1.0f);
    testmesh::Mesh floor;
    CompleteGrid grid;
    TextureFactory textures;
    std::unique_ptr<PhongShader> material;
    std::unique_ptr<LightSource> light[3];
    const LightSource *lightList[3][1] = {};
    ShadingScene scene[3];
    NullRenderPass beauty;

    Fixture() {
        setTypeEnabled(kMsgInfo | kMsgProgress | kMsgDebug | kMsgVerbose, false);
        // The floor: 64 x 64 quads over [-4, 4]^2 at y = -2, facing up.
        const int q = 64;
        for (int j = 0; j <= q; ++j)
            for (int i = 0; i <= q; ++i)
                floor.positions.push_back({-4.0f + 8.0f * i / q, -2.0f, -4.0f + 8.0f * j / q});
        for (int j = 0; j < q; ++j)
            for (int i = 0; i < q; ++i) {
                const uint32_t a = j * (q + 1) + i, b = a + 1, c = a + q + 1, d = c + 1;
                floor.indices.insert(floor.indices.end(), {a, c, b, b, c, d});
            }
        std::vector<InstanceInput> inputs;
        for (const testmesh::Mesh *m : {&blob, &floor}) {
            InstanceInput in;
            in.name = inputs.empty() ? "blob" : "floor";
            in.shape = inputs.size() + 1;
            in.index = uint32_t(inputs.size());
            in.flags = 0xFFFFFFFFu;
            in.mesh.positions = m->positions.data();
            in.mesh.vertexCount = m->positions.size();
            in.mesh.indices = m->indices.data();
            in.mesh.triangleCount = m->triangleCount();
            inputs.push_back(in);
        }
        grid.build(inputs, ADSParameters());

        PhongParameters p;
        p.channels[kPhongDiffuse].textureFile = checkerFile();
        p.channels[kPhongDiffuse].scale = 1.0f;
        p.channels[kPhongSpecular].color = Color(0.3f, 0.3f, 0.3f, 1);
        p.shininess = 20.0f;
        loadChannelTextures("bench", p, textures);
        material = std::make_unique<PhongShader>("bench", p);

        const uint32_t samples[3] = {1, 1, 16};
        for (int k = 0; k < 3; ++k) {
            LightParameters lp;
            lp.name = "key";
            lp.type = LightType::kPoint;
            lp.color = Color(20, 20, 20, 1);
            lp.falloffExponent = 2.0f;
            lp.decayClampToOne = false;
            lp.castShadows = k > 0;
            lp.pointLightShadowRadius = 0.2f;
            lp.shadowSamples = int32_t(samples[k]);
            lp.objectToWorld = Mtx4::translation({0.5f, 3.0f, 0.3f});
            bool shadows = false;
            light[k] = createLight(lp, shadows);
            lightList[k][0] = light[k].get();
            scene[k].lights = lightList[k];
            scene[k].lightCount = 1;
            scene[k].setRayTracing(&grid, 0.001f);
        }
    }
};

Fixture &fixture() {
    static Fixture f;
    return f;
}

void BM_Shade(benchmark::State &state) {
    Fixture &f = fixture();
    const int variant = int(state.range(0));
    Random random(uint64_t(1234 + state.thread_index()));
    RayCounter rays;
    ShadingContext ctx;
    ctx.scene = &f.scene[variant];
    ctx.random = &random;
    ctx.rays = &rays;
    // Points on the floor seen from a camera above, in a fixed order.
    constexpr int kPoints = 4096;
    std::vector<Vec3> points(kPoints);
    Random place(99);
    for (Vec3 &p : points) p = Vec3(-4 + 8 * place.next(), -2.0f, -4 + 8 * place.next());
    const Vec3 eye(0, 4, 8);
    double cpu = 0;
    int64_t n = 0;
    float sum = 0;
    for (auto _ : state) {
        const double t0 = threadSeconds();
        for (int k = 0; k < 256; ++k) {
            const Vec3 &p = points[size_t(n + k) & (kPoints - 1)];
            ctx.beginSample(eye, (p - eye).normalized());
            SurfacePoint &sp = ctx.surface;
            sp.position = p;
            sp.geometricNormal = sp.normal = Vec3(0, 1, 0);
            sp.tangent = Vec3(1, 0, 0);
            sp.bitangent = Vec3(0, 0, -1);
            sp.uvSetCount = 1;
            sp.uvs[0].uv = Vec2(p.x * 0.25f, p.z * 0.25f);
            sp.uvs[0].dUVdx = Vec2(0.002f, 0);
            sp.uvs[0].dUVdy = Vec2(0, 0.002f);
            sum += f.beauty.shade(ctx, *f.material).r;
        }
        cpu += threadSeconds() - t0;
        n += 256;
    }
    benchmark::DoNotOptimize(sum);
    state.SetItemsProcessed(n);
    // Counters are averaged over the threads: figures per thread.
    state.counters["shadePerCpuSecond"] =
        benchmark::Counter(double(n) / cpu, benchmark::Counter::kAvgThreads);
    state.counters["shadowRaysPerShade"] =
        benchmark::Counter(double(rays.total()) / double(n), benchmark::Counter::kAvgThreads);
}

BENCHMARK(BM_Shade)
    ->ArgName("variant(0=unshadowed,1=1ray,2=16rays)")
    ->Arg(0)
    ->Arg(1)
    ->Arg(2)
    ->Threads(1)
    ->Threads(2)
    ->UseRealTime();

}  // namespace

BENCHMARK_MAIN();
