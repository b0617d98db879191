// Lights against closed forms: attenuation, cones, gobos, the area light's cosine, soft shadows
// over a half-blocked light, and the image-based light.
#include "shading/light.h"

#include <gtest/gtest.h>

#include <cmath>
#include <fstream>
#include <memory>
#include <vector>

#include "config/ox_config.h"
#include "core/message.h"
#include "core/random.h"
#include "raytrace/complete_grid.h"
#include "shading/light_loop.h"
#include "shading/shadow_sampler.h"
#include "tests/support/tga_file.h"
#include "texture/texture_factory.h"

namespace ox {
namespace {

constexpr float kPi = 3.14159265358979f;
constexpr float kDeg = kPi / 180.0f;

// Grids built by the tests report their progress; keep the test output quiet.
const bool kQuiet = [] {
    setTypeEnabled(kMsgProgress | kMsgInfo | kMsgBench, false);
    return true;
}();

void expectRelative(float got, float want, float rel, const char *what) {
    EXPECT_NEAR(got, want, rel * std::fmax(std::fabs(want), 1e-30f)) << what;
}

// A light made through the scene's factory.
template <typename T>
std::unique_ptr<T> make(const LightParameters &p) {
    bool shadows = false;
    auto light = createLight(p, shadows);
    auto *typed = dynamic_cast<T *>(light.get());
    EXPECT_NE(typed, nullptr);
    light.release();
    return std::unique_ptr<T>(typed);
}

LightParameters whiteLight(LightType type, const Mtx4 &m) {
    LightParameters p;
    p.name = "l";
    p.type = type;
    p.color = Color(1, 1, 1, 1);
    p.objectToWorld = m;
    p.castShadows = false;
    return p;
}

TEST(LightAttenuation, PointLightOverPlaneAndCutOffs) {
    // Light of colour 1 at height h over the plane y = 0: E(x) = h / (h^2 + x^2)^1.5.
    LightParameters p = whiteLight(LightType::kPoint, Mtx4::translation({0, 1, 0}));
    p.falloffExponent = 2.0f;
    p.decayClampToOne = false;
    auto light = make<SimplePointLight>(p);
    LightContext ctx;
    const Vec3 n(0, 1, 0);
    for (float x : {0.0f, 0.25f, 1.0f, 2.0f, 5.0f}) {
        const Vec3 at(x, 0, 0);
        const float e = light->illuminate(at, n, ctx, true).r * light->cosineFactor(at, n);
        expectRelative(e, 1.0f / std::pow(1.0f + x * x, 1.5f), 1e-4f, "standard");
    }
    EXPECT_NEAR(light->illuminate({1, 0, 0}, n, ctx, false).r * light->cosineFactor({1, 0, 0}, n),
                0.353553f, 1e-5f);

    // At the light itself the distance is the ray bias: large but finite.
    ShadowTracer tracer;
    tracer.bias = 0.01f;
    ctx.tracer = &tracer;
    expectRelative(light->illuminate({0, 1, 0}, n, ctx, false).r, 1e4f, 1e-4f, "at bias");
    ctx.tracer = nullptr;
    EXPECT_TRUE(std::isfinite(light->illuminate({0, 1, 0}, n, ctx, false).r));
    EXPECT_EQ(light->directionToLight({0, 1, 0}), Vec3(0, 0, 0));

    // Clamped: never above the colour, even closer than 1.
    p.decayClampToOne = true;
    auto clamped = make<SimplePointLight>(p);
    for (float y : {0.0f, 0.999f, 0.5f, -1.0f})
        EXPECT_LE(clamped->illuminate({0, y, 0}, n, ctx, false).r, 1.0f);

    // Unreal, exponent 1, cut-off 2: 1 - (d / 2)^2, and nothing at or beyond the cut-off.
    p.attenuationType = AttenuationType::kUnreal;
    p.falloffExponent = 1.0f;
    p.decayCutoff = 2.0f;
    auto unreal = make<SimplePointLight>(p);
    EXPECT_NEAR(unreal->illuminate({0, 0, 0}, n, ctx, false).r, 0.75f, 1e-6f);
    EXPECT_EQ(unreal->illuminate({0, -1, 0}, n, ctx, false).r, 0.0f);
    EXPECT_EQ(unreal->illuminate({0, 4, 0}, n, ctx, false).r, 0.0f);
    EXPECT_FALSE(unreal->affectsPoint({0, -1.5f, 0}));
    EXPECT_TRUE(unreal->affectsPoint({0, 0, 0}));
    // Exponent 0 must still cut off (0^0 is not 1 here), and a cut-off of 0 lights nothing.
    EXPECT_EQ(UnrealAttenuation(0.0f, 2.0f).attenuate(2.0f), 0.0f);
    EXPECT_EQ(UnrealAttenuation(0.0f, 2.0f).attenuate(3.0f), 0.0f);
    EXPECT_EQ(UnrealAttenuation(1.0f, 0.0f).attenuate(0.0f), 0.0f);
    EXPECT_EQ(UnrealAttenuation(1.0f, -1.0f).attenuate(0.5f), 0.0f);

    // Hostile distances and exponents give finite, non-negative factors.
    const StandardAttenuation s20(20.0f), sNan(NAN);
    const UnrealAttenuation uNeg(-3.0f, 1.0f);
    for (float d : {0.0f, -1.0f, NAN, 1e-30f, INFINITY}) {
        for (const AttenuationSettings *a :
             std::initializer_list<const AttenuationSettings *>{&s20, &sNan, &uNeg}) {
            const float f = a->attenuate(d);
            EXPECT_TRUE(std::isfinite(f) && f >= 0.0f) << d;
        }
    }
}

TEST(LightAttenuation, RampRunsOverTheLightsUnitSphere) {
    LightParameters p = whiteLight(LightType::kPoint, Mtx4::scale({2, 2, 2}));
    p.lightRampColors = {{1, 0, 0, 0.0f}, {0, 0, 1, 1.0f}};
    auto light = make<SimplePointLight>(p);
    LightContext ctx;
    // World distance 1 is light-space distance 0.5: halfway along the ramp, no attenuation.
    const Color mid = light->illuminate({1, 0, 0}, {1, 0, 0}, ctx, false);
    EXPECT_FLOAT_EQ(mid.r, 0.5f);
    EXPECT_FLOAT_EQ(mid.b, 0.5f);
    EXPECT_EQ(light->illuminate({2.5f, 0, 0}, {1, 0, 0}, ctx, false), Color::black());
    EXPECT_FALSE(light->affectsPoint({2.5f, 0, 0}));
    EXPECT_TRUE(light->affectsPoint({1.5f, 0, 0}));
}

// A texture that answers its own coordinates.
class CoordinateTexture : public TextureLookupInterface {
public:
    Color lookup(float u, float v) const override { return Color(u, v, 1, 1); }
};

TEST(SpotLight, ConePenumbraAndGobo) {
    // Cone 60, penumbra 10, exponent 1: inner 30, outer 40 degrees off the -y axis.
    LightParameters p = whiteLight(LightType::kSpot, Mtx4());
    p.spotLightConeAngle = 60.0f;
    p.spotLightPenumbraAngle = 10.0f;
    p.spotLightPenumbraExponent = 1.0f;
    auto spot = make<SimpleSpotLight>(p);
    LightContext ctx;
    const struct {
        float degrees, falloff;
    } cases[] = {{0, 1}, {29.9f, 1}, {35, 0.53118f}, {40.1f, 0}, {90, 0}, {180, 0}};
    for (const auto &c : cases) {
        const Vec3 at(std::sin(c.degrees * kDeg), -std::cos(c.degrees * kDeg), 0);
        EXPECT_NEAR(spot->illuminate(at, -at, ctx, false).r, c.falloff, 1e-4f) << c.degrees;
    }

    // Angles out of range are clamped: an outer cone past 180 degrees lights everything, an
    // inner cone below 0 starts at the axis.
    p.spotLightConeAngle = 300.0f;
    p.spotLightPenumbraAngle = 100.0f;
    EXPECT_FLOAT_EQ(make<SimpleSpotLight>(p)->cosOuter(), -1.0f);
    p.spotLightConeAngle = 10.0f;
    p.spotLightPenumbraAngle = -40.0f;
    EXPECT_FLOAT_EQ(make<SimpleSpotLight>(p)->cosInner(), 1.0f);

    // The gobo spans [0, 1]^2 over the cone: centre on the axis, edges at the outer angle.
    spot->setGoboTexture(std::make_shared<CoordinateTexture>());
    ASSERT_TRUE(spot->hasGobo());
    float u, v;
    const float outer = 40.0f * kDeg;
    ASSERT_TRUE(spot->goboCoordinates({0, -1, 0}, u, v));
    EXPECT_NEAR(u, 0.5f, 1e-6f);
    EXPECT_NEAR(v, 0.5f, 1e-6f);
    ASSERT_TRUE(spot->goboCoordinates({std::sin(outer), -std::cos(outer), 0}, u, v));
    EXPECT_NEAR(u, 1.0f, 1e-5f);
    ASSERT_TRUE(spot->goboCoordinates({0, -std::cos(outer), -std::sin(outer)}, u, v));
    EXPECT_NEAR(v, 0.0f, 1e-5f);
    EXPECT_FALSE(spot->goboCoordinates({0, 1, 0}, u, v));
    const Color lit = spot->illuminate({0.1f, -1, 0}, {0, 1, 0}, ctx, false);
    EXPECT_GT(lit.r, 0.5f);  // the gobo's u, right of the centre
    EXPECT_LT(lit.r, 1.0f);

    // A gobo on a cone of 90 degrees or more: behind the light is dark, never NaN.
    p.spotLightConeAngle = 200.0f;
    p.spotLightPenumbraAngle = 0.0f;
    auto wide = make<SimpleSpotLight>(p);
    wide->setGoboTexture(std::make_shared<CoordinateTexture>());
    EXPECT_EQ(wide->illuminate({1, 0.1f, 0}, {0, 1, 0}, ctx, false), Color::black());
    const Color side = wide->illuminate({1, -0.01f, 0}, {0, 1, 0}, ctx, false);
    EXPECT_TRUE(std::isfinite(side.r) && std::isfinite(side.g));
}

// Area light: the square [-1, 1]^2 at z = 2, facing down.
Mtx4 downwardSquare(float height) {
    Mtx4 m;
    m.m[1][1] = -1.0f;
    m.m[2][2] = -1.0f;
    m.m[3][2] = height;
    return m;
}

TEST(AreaLight, SidesAndCosineOverTheRectangle) {
    auto area = make<SimpleAreaLight>(whiteLight(LightType::kArea, downwardSquare(1.0f)));
    LightContext ctx;
    EXPECT_EQ(area->normal(), Vec3(0, 0, -1));
    EXPECT_EQ(area->illuminate({0, 0, 2}, {0, 0, -1}, ctx, false), Color::black());
    EXPECT_FALSE(area->affectsPoint({0, 0, 2}));
    EXPECT_EQ(area->illuminate({0, 0, 0}, {0, 0, 1}, ctx, false), Color(1, 1, 1, 1));

    // Below the centre at height 1, facing it: the mean cosine over the square's solid angle,
    // (4 atan(1 / sqrt 2) / sqrt 2) / (4 asin(1 / 2)) = 0.831182.
    expectRelative(area->cosineFactor({0, 0, 0}, {0, 0, 1}), 0.831182f, 1e-4f, "near");
    // Far away it is the cosine towards the centre; below the horizon nothing.
    expectRelative(area->cosineFactor({0, 0, -1000}, {std::sin(60 * kDeg), 0, std::cos(60 * kDeg)}),
                   0.5f, 1e-3f, "far");
    EXPECT_EQ(area->cosineFactor({0, 0, 0}, {0, 0, -1}), 0.0f);
    // A surface whose horizon cuts the light in half sees half the facing cosine's integral.
    const float half = area->cosineFactor({0, 0, 0}, {1, 0, 0});
    EXPECT_GT(half, 0.0f);
    EXPECT_LT(half, 0.5f);
}

// A scene of blocking quads, four corners each.
struct Blocker {
    std::vector<Vec3> positions;
    std::vector<uint32_t> indices;
    CompleteGrid grid;
    ShadowTracer tracer;

    Blocker(Vec3 a, Vec3 b, Vec3 c, Vec3 d) : Blocker(std::vector<Vec3>{a, b, c, d}) {}
    explicit Blocker(std::vector<Vec3> quads) : positions(std::move(quads)) {
        for (uint32_t q = 0; q + 4 <= positions.size(); q += 4)
            indices.insert(indices.end(), {q, q + 1, q + 2, q, q + 2, q + 3});
        build();
    }
    void build() {
        InstanceInput in;
        in.name = "blocker";
        in.mesh.positions = positions.data();
        in.mesh.vertexCount = positions.size();
        in.mesh.indices = indices.data();
        in.mesh.triangleCount = indices.size() / 3;
        in.flags = 0x4EDFF;
        in.index = 0;
        EXPECT_TRUE(grid.build({in}, ADSParameters()));
        tracer.ads = &grid;
        tracer.bias = 1e-4f;
    }
};

// A blocker at z = 1 covering x < 0: from (px, py, 0) it hides the part lx < -px of the light
// at z = 2, so the transmission is (1 + px) / 2.
Blocker halfPlane() {
    return Blocker({-5000, -5000, 1}, {0, -5000, 1}, {0, 5000, 1}, {-5000, 5000, 1});
}
// A blocker at z = 1 hiding the whole upper half space from the origin.
Blocker ceiling() {
    return Blocker({-5000, -5000, 1}, {5000, -5000, 1}, {5000, 5000, 1}, {-5000, 5000, 1});
}

TEST(ShadowSampling, HalfBlockedAreaLight) {
    Blocker blocker = halfPlane();
    LightParameters p = whiteLight(LightType::kArea, downwardSquare(2.0f));
    p.castShadows = true;
    p.shadowSamples = 64;
    auto area = make<SimpleAreaLight>(p);
    Random random(17);
    RayCounter counter;
    LightContext ctx;
    ctx.tracer = &blocker.tracer;
    ctx.random = &random;
    ctx.counter = &counter;

    // Even layouts aligned with the blocker's edge: exactly half, for every seed.
    for (int samples : {64, 16, 36, 4}) {
        p.shadowSamples = samples;
        auto light = make<SimpleAreaLight>(p);
        for (float py : {0.0f, 0.7f, -3.0f})
            EXPECT_EQ(light->shadowTransmission({0, py, 0}, ctx, 1.0f).r, 0.5f) << samples;
    }
    EXPECT_EQ(counter.count(kRayShadow), uint64_t(3 * (64 + 16 + 36 + 4)));
    // Out of the blocker's shadow: exactly 1; through illuminate the light is halved.
    EXPECT_EQ(area->shadowTransmission({5, 0, 0}, ctx, 1.0f), Color::white());
    EXPECT_EQ(area->illuminate({0, 0, 0}, {0, 0, 1}, ctx, true).r, 0.5f);
    Color shadowed, unshadowed;
    area->illuminateBoth(shadowed, unshadowed, {0, 0, 0}, {0, 0, 1}, ctx);
    EXPECT_EQ(unshadowed, Color(1, 1, 1, 1));
    EXPECT_EQ(shadowed, Color(0.5f, 0.5f, 0.5f, 1));  // alpha is not shadowed

    // Shadows are not traced at the depth limit, when the context forbids them, or for a light
    // that casts none.
    ctx.rayDepth = 10;
    EXPECT_EQ(area->shadowTransmission({0, 0, 0}, ctx, 1.0f), Color::white());
    ctx.rayDepth = 9;
    EXPECT_EQ(area->shadowTransmission({0, 0, 0}, ctx, 1.0f).r, 0.5f);
    ctx.allowShadows = false;
    EXPECT_EQ(area->shadowTransmission({0, 0, 0}, ctx, 1.0f), Color::white());
    ctx.allowShadows = true;
    p.castShadows = false;
    EXPECT_EQ(make<SimpleAreaLight>(p)->shadowTransmission({0, 0, 0}, ctx, 1.0f), Color::white());
}

// Surfaces of one transparency colour.
struct TintedSurfaces : ShadowTransparencyInterface {
    Color tint;
    explicit TintedSurfaces(Color c) : tint(c) {}
    Color transparency(const Ray &, const Hit &) const override { return tint; }
};

TEST(ShadowSampling, SemiTransparentOccluders) {
    // The half-blocked area light behind a tinted blocker: the hidden half passes the tint.
    Blocker half = halfPlane();
    TintedSurfaces tint(Color(0.5f, 0.25f, 1.0f, 1));
    half.tracer.transparency = &tint;
    LightParameters p = whiteLight(LightType::kArea, downwardSquare(2.0f));
    p.castShadows = true;
    p.shadowSamples = 64;
    Random random(4);
    LightContext ctx;
    ctx.tracer = &half.tracer;
    ctx.random = &random;
    const Color t = make<SimpleAreaLight>(p)->shadowTransmission({0, 0, 0}, ctx, 1.0f);
    EXPECT_EQ(Vec3(t.r, t.g, t.b), Vec3(0.75f, 0.625f, 1.0f));

    // Two sheets between a point light and the point multiply; channels outside [0, 1] and NaN
    // are taken within it (NaN as opaque).
    Blocker sheets({{-50, -50, 1},
                    {50, -50, 1},
                    {50, 50, 1},
                    {-50, 50, 1},  //
                    {-50, -50, 2},
                    {50, -50, 2},
                    {50, 50, 2},
                    {-50, 50, 2}});
    sheets.tracer.transparency = &tint;
    ctx.tracer = &sheets.tracer;
    p = whiteLight(LightType::kPoint, Mtx4::translation({0, 0, 3}));
    p.castShadows = true;
    auto point = make<SimplePointLight>(p);
    const struct {
        Color tint, want;
    } cases[] = {{{0.5f, 0.5f, 0.5f, 1}, {0.25f, 0.25f, 0.25f, 0.25f}},
                 {{NAN, -1, 2, 1}, {0, 0, 1, 1.0f / 3.0f}},
                 {{0, 0, 0, 1}, Color::black()}};
    for (const auto &c : cases) {
        tint.tint = c.tint;
        const Color got = point->shadowTransmission({0, 0, 0}, ctx, 1.0f);
        EXPECT_EQ(Vec3(got.r, got.g, got.b), Vec3(c.want.r, c.want.g, c.want.b));
        EXPECT_NEAR(got.a, c.want.a, 1e-6f);
    }
}

TEST(ShadowSampling, StratifiedHalvesTheErrorOfPlainRandom) {
    Blocker blocker = halfPlane();
    LightParameters p = whiteLight(LightType::kArea, downwardSquare(2.0f));
    p.castShadows = true;
    p.shadowSamples = 64;
    auto area = make<SimpleAreaLight>(p);
    Random random(99), plain(5);
    LightContext ctx;
    ctx.tracer = &blocker.tracer;
    ctx.random = &random;

    // Over many points whose blocker edge falls anywhere in the light, against the closed form
    // (1 + px) / 2, and against 64 plain random rays to the same light.
    double strat2 = 0, plain2 = 0, stratSum = 0, exactSum = 0;
    const int points = 400;
    for (int k = 0; k < points; ++k) {
        const float px = plain.next() - 0.5f, py = 2.0f * plain.next() - 1.0f;
        const Vec3 at(px, py, 0);
        const double exact = 0.5 * (1.0 + px);
        const double s = area->shadowTransmission(at, ctx, 1.0f).r;
        int open = 0;
        for (int i = 0; i < 64; ++i) {
            const Vec3 q(2.0f * plain.next() - 1.0f, 2.0f * plain.next() - 1.0f, 2.0f);
            open += !shadowSegmentBlocked(at, q, ctx);
        }
        strat2 += (s - exact) * (s - exact);
        plain2 += (open / 64.0 - exact) * (open / 64.0 - exact);
        stratSum += s;
        exactSum += exact;
    }
    const double stratRms = std::sqrt(strat2 / points), plainRms = std::sqrt(plain2 / points);
    RecordProperty("stratifiedRms", std::to_string(stratRms));
    RecordProperty("plainRms", std::to_string(plainRms));
    EXPECT_LT(stratRms, 0.5 * plainRms) << stratRms << " vs " << plainRms;
    // The mean over the points is the exact mean within 1%.
    EXPECT_NEAR(stratSum / points, exactSum / points, 0.01 * exactSum / points);
}

TEST(ShadowSampling, DeterministicPerSeed) {
    Blocker blocker = halfPlane();
    LightParameters p = whiteLight(LightType::kArea, downwardSquare(2.0f));
    p.castShadows = true;
    p.shadowSamples = 25;
    auto area = make<SimpleAreaLight>(p);
    auto run = [&](uint64_t seed) {
        Random random(seed);
        LightContext ctx;
        ctx.tracer = &blocker.tracer;
        ctx.random = &random;
        std::vector<float> out;
        for (int k = 0; k < 50; ++k)
            out.push_back(area->shadowTransmission({0.01f * k - 0.25f, 0, 0}, ctx, 1.0f).r);
        return out;
    };
    EXPECT_EQ(run(3), run(3));
    EXPECT_NE(run(3), run(4));
}

TEST(ShadowSampling, CountsLayoutsAndDisk) {
    const struct {
        uint32_t n, nx, ny;
    } layouts[] = {{0, 1, 1}, {1, 1, 1},  {5, 2, 2},     {6, 2, 3},     {8, 2, 4},
                   {9, 3, 3}, {15, 3, 5}, {256, 16, 16}, {9000, 16, 16}};
    for (const auto &l : layouts) {
        const ShadowGrid g = shadowGridLayout(l.n);
        EXPECT_EQ(g.nx, l.nx) << l.n;
        EXPECT_EQ(g.ny, l.ny) << l.n;
    }

    ShadowSamplerSettings s;
    s.samples = 64;
    ShadowTracer tracer;
    LightContext ctx;
    ctx.tracer = &tracer;
    const struct {
        float importance;
        uint32_t minLight, minRays, maxRays;
        uint32_t want;
    } counts[] = {
        {1.0f, 0, 0, 0xFFFFFFFFu, 64},
        {0.25f, 0, 0, 0xFFFFFFFFu, 32},
        {4.0f, 0, 0, 0xFFFFFFFFu, 64},
        {NAN, 0, 0, 0xFFFFFFFFu, 1},
        {-1.0f, 0, 0, 0xFFFFFFFFu, 1},
        {1.0f, 100, 0, 0xFFFFFFFFu, 100},
        {1.0f, 0, 0xFFFFFFFFu, 0xFFFFFFFFu, 256},
        {1.0f, 0, 0, 8, 8},
        {1.0f, 0, 0, 0, 1},
    };
    for (const auto &c : counts) {
        s.minSamples = c.minLight;
        tracer.minShadowRays = c.minRays;
        tracer.maxShadowRays = c.maxRays;
        EXPECT_EQ(shadowSampleCount(s, ctx, c.importance), c.want) << c.importance;
    }
    ctx.singleShadowRay = true;
    EXPECT_EQ(shadowSampleCount(s, ctx, 1.0f), 1u);

    // The concentric disk: centre to centre, edges to the circle, left half to the left half.
    EXPECT_EQ(concentricDisk(0, 0), Vec2(0, 0));
    const Vec2 e = concentricDisk(1, 0), c = concentricDisk(-1, -1);
    EXPECT_NEAR(e.x, 1.0f, 1e-6f);
    EXPECT_NEAR(c.x, -std::sqrt(0.5f), 1e-6f);
    EXPECT_NEAR(c.y, -std::sqrt(0.5f), 1e-6f);
    Random r(1);
    for (int i = 0; i < 200; ++i) {
        const float a = 2 * r.next() - 1, b = 2 * r.next() - 1;
        const Vec2 d = concentricDisk(a, b);
        EXPECT_LE(d.x * d.x + d.y * d.y, 1.0f + 1e-6f);
        EXPECT_EQ(d.x < 0.0f, a < 0.0f);
    }
}

TEST(ShadowSampling, PointDirectionalAndWindow) {
    // A wide blocker at z = 1 hides everything above the origin.
    Blocker blocker = ceiling();
    Random random(1);
    RayCounter counter;
    LightContext ctx;
    ctx.tracer = &blocker.tracer;
    ctx.random = &random;
    ctx.counter = &counter;

    LightParameters p = whiteLight(LightType::kPoint, Mtx4::translation({0, 0, 3}));
    p.castShadows = true;
    p.shadowSamples = 16;
    auto point = make<SimplePointLight>(p);
    EXPECT_EQ(point->shadowTransmission({0, 0, 0}, ctx, 1.0f), Color::black());
    EXPECT_EQ(counter.count(kRayShadow), 1u);  // radius 0: one ray is all rays
    EXPECT_EQ(point->shadowTransmission({0, 0, 2}, ctx, 1.0f), Color::white());
    p.pointLightShadowRadius = 0.5f;
    make<SimplePointLight>(p)->shadowTransmission({0, 0, 0}, ctx, 1.0f);
    EXPECT_EQ(counter.count(kRayShadow), 1u + 1u + 16u);

    // A directional light from straight above, with a cone of 5 degrees.
    // Local y turned to world z, so the light shines down -z.
    LightParameters d = whiteLight(LightType::kDirectional, Mtx4());
    d.objectToWorld.m[1][1] = 0, d.objectToWorld.m[1][2] = 1;
    d.objectToWorld.m[2][1] = -1, d.objectToWorld.m[2][2] = 0;
    d.castShadows = true;
    d.directionalLightShadowAngle = 5.0f;
    d.shadowSamples = 9;
    auto dir = make<SimpleDirectionalLight>(d);
    ASSERT_NEAR(dir->direction().z, 1.0f, 1e-6f);
    EXPECT_EQ(dir->shadowTransmission({0, 0, 0}, ctx, 1.0f), Color::black());
    EXPECT_EQ(dir->shadowTransmission({0, 0, 2}, ctx, 1.0f), Color::white());

    // A window at z = 10 facing down, no other geometry above z = 1: only points under the
    // window's rectangle see through it.
    Blocker floorOnly({-50, -50, -5}, {50, -50, -5}, {50, 50, -5}, {-50, 50, -5});
    ctx.tracer = &floorOnly.tracer;
    LightParameters w = whiteLight(LightType::kWindow, downwardSquare(10.0f));
    w.castShadows = true;
    w.directionalLightShadowAngle = 2.0f;
    w.shadowSamples = 16;
    auto window = make<SimpleWindowLight>(w);
    EXPECT_EQ(window->directionToLight({0, 0, 0}), Vec3(0, 0, 1));
    EXPECT_EQ(window->shadowTransmission({0, 0, 0}, ctx, 1.0f), Color::white());
    EXPECT_EQ(window->shadowTransmission({3, 0, 0}, ctx, 1.0f), Color::black());
    const float edge = window->shadowTransmission({1, 0, 0}, ctx, 1.0f).r;
    EXPECT_GT(edge, 0.0f);
    EXPECT_LT(edge, 1.0f);
}

// A probe of w x h texels of one colour.
LightProbeImage constantProbe(int32_t w, int32_t h, const Color &c) {
    LightProbeImage probe;
    probe.width = w;
    probe.height = h;
    probe.texels.assign(size_t(w) * size_t(h), c);
    return probe;
}

TEST(ImageBasedLight, ConstantProbeLightsEveryUpwardNormalAlike) {
    EnvironmentValues v;
    v.iblSamples = 2048;
    KDHDRLight light(v);
    ASSERT_TRUE(light.buildSubLights(constantProbe(128, 64, Color(1, 1, 1, 1))));
    EXPECT_EQ(light.subLights().size(), 2048u);
    LightContext ctx;
    Random r(3);
    // A radiance of 1 everywhere gives 1 on every normal (irradiance / pi).
    for (int k = 0; k < 100; ++k) {
        Vec3 n(2 * r.next() - 1, r.next(), 2 * r.next() - 1);
        n.normalize();
        const float e =
            light.illuminate({0, 0, 0}, n, ctx, false).r * light.cosineFactor({0, 0, 0}, n);
        EXPECT_NEAR(e, 1.0f, 0.01f) << n.x << " " << n.y << " " << n.z;
    }
}

TEST(ImageBasedLight, SpecularEmissionLeavesDiffuseLightAlone) {
    // Diffuse light a surface receives from the image light and its specular sub-lights, each
    // weighted as the shading loop weighs it. Turning specular emission on adds specular light
    // only; with diffuse emission off, the sub-lights carry the diffuse part themselves.
    const LightProbeImage probe = constantProbe(64, 32, Color(1, 1, 1, 1));
    auto diffuseAt = [&](bool emitDiffuse, bool emitSpecular, const Vec3 &n, float &specular) {
        EnvironmentValues v;
        v.iblSamples = 512;
        v.iblEmitDiffuse = emitDiffuse;
        v.iblEmitSpecular = emitSpecular;
        KDHDRLight light(v);
        EXPECT_TRUE(light.buildSubLights(probe));
        LightContext ctx;
        // Lights that add nothing under the mask have a negative weight.
        auto weight = [](uint32_t flags, float cosine) {
            return std::fmax(0.0f, diffuseWeight(flags, kShadeDiffuse, cosine));
        };
        float diffuse = weight(light.flags(), 1.0f) * light.illuminate({0, 0, 0}, n, ctx, false).r;
        specular = 0.0f;
        if (emitSpecular)
            for (const auto &sub : light.makeSpecularSubLights()) {
                const float c = sub->illuminate({0, 0, 0}, n, ctx, false).r;
                diffuse += weight(sub->flags(), dot(n, sub->directionToLight({0, 0, 0}))) * c;
                if (sub->flags() & kLightSpecular) specular += c;
            }
        return diffuse;
    };
    for (const Vec3 &n : {Vec3(0, 1, 0), Vec3(1, 1, 0).normalized(), Vec3(0, 0, -1)}) {
        float specular = 0.0f, none = 0.0f;
        const float alone = diffuseAt(true, false, n, none);
        EXPECT_NEAR(alone, 1.0f, 0.02f);
        EXPECT_FLOAT_EQ(diffuseAt(true, true, n, specular), alone);
        EXPECT_GT(specular, 0.0f);
        EXPECT_GT(diffuseAt(false, true, n, specular), 0.0f);
        EXPECT_EQ(diffuseAt(false, false, n, none), 0.0f);
    }
}

TEST(ImageBasedLight, ProbeFileThroughTheTextureManager) {
    // A constant probe of (0.4, 0.6, 0.8) written as a file and read by the texture manager.
    const std::string file = testing::TempDir() + "ox_light_probe.tga", bad = file + ".bad.tga";
    ASSERT_TRUE(oxtest::writeTGA(file, 128, 64, {128 * 64, {102, 153, 204}}));
    TextureFactory textures;
    EnvironmentValues v;
    v.iblSamples = 2048;
    v.iblImageFile = file;
    auto light = createImageBasedLight(v, textures);
    ASSERT_TRUE(light);
    EXPECT_EQ(light->subLights().size(), 2048u);
    LightContext ctx;
    Random r(5);
    for (int k = 0; k < 50; ++k) {
        const Vec3 n = k == 0 ? Vec3(0, 1, 0)
                              : Vec3(2 * r.next() - 1, r.next(), 2 * r.next() - 1).normalized();
        const Color e = light->illuminate({0, 0, 0}, n, ctx, false) * light->cosineFactor({}, n);
        expectRelative(e.g, 0.6f, 0.01f, "green");
        expectRelative(e.b, 0.8f, 0.01f, "blue");
    }
    // A probe wider than the limit is read from a mip level of the same mean.
    LightProbeImage small;
    ASSERT_TRUE(readLightProbe(textures, file, small, 16));
    EXPECT_EQ(small.width, 16);
    EXPECT_EQ(small.height, 8);
    EXPECT_NEAR(small.at(15, 7).r, 0.4f, 1e-6f);
    // A file the readers cannot decode gives no light.
    std::ofstream(bad) << "not an image";
    v.iblImageFile = bad;
    EXPECT_EQ(createImageBasedLight(v, textures), nullptr);
}

TEST(ImageBasedLight, BrightTexelMakesOneDominantSubLight) {
    LightProbeImage probe = constantProbe(64, 32, Color(0.01f, 0.01f, 0.01f, 1));
    const int32_t bx = 40, by = 22;
    probe.texels[size_t(by) * 64 + bx] = Color(10000, 10000, 10000, 1);
    EnvironmentValues v;
    v.iblSamples = 64;
    KDHDRLight light(v);
    ASSERT_TRUE(light.buildSubLights(probe));
    ASSERT_EQ(light.subLights().size(), 64u);
    const Vec3 want = probeDirection((bx + 0.5f) / 64, (by + 0.5f) / 32);
    const IBLSubLight *top = nullptr;
    float second = 0;
    for (const IBLSubLight &l : light.subLights()) {
        if (!top || l.color.luminance() > top->color.luminance()) {
            if (top) second = std::fmax(second, top->color.luminance());
            top = &l;
        } else {
            second = std::fmax(second, l.color.luminance());
        }
    }
    EXPECT_GT(top->color.luminance(), 100 * second);
    EXPECT_GT(dot(top->direction, want), std::cos(2.0f * kPi / 64));
    EXPECT_GT(dot(light.directionToLight({0, 0, 0}), want), std::cos(2.0f * kPi / 64));

    // Turning the dome turns the sub-light about the up axis.
    v.iblTurnDome = 90.0f;
    KDHDRLight turned(v);
    ASSERT_TRUE(turned.buildSubLights(probe));
    const Vec3 t = turned.directionToLight({0, 0, 0});
    EXPECT_NEAR(t.y, light.directionToLight({0, 0, 0}).y, 1e-5f);
}

TEST(ImageBasedLight, RowsPolesCountsAndBadProbes) {
    // Only the bottom row lit: its weight is not 0, so the light exists and points down.
    LightProbeImage probe = constantProbe(16, 8, Color());
    for (int x = 0; x < 16; ++x) probe.texels[size_t(x)] = Color(1, 1, 1, 1);
    EnvironmentValues v;
    v.iblSamples = 4;
    KDHDRLight light(v);
    ASSERT_TRUE(light.buildSubLights(probe));
    ASSERT_FALSE(light.subLights().empty());
    EXPECT_LT(light.subLights()[0].direction.y, -0.9f);
    LightContext ctx;
    EXPECT_EQ(light.illuminate({0, 0, 0}, {0, 1, 0}, ctx, false), Color());

    // More sub-lights than texels: each texel is one region.
    v.iblSamples = 1000;
    KDHDRLight many(v);
    ASSERT_TRUE(many.buildSubLights(constantProbe(4, 2, Color(1, 1, 1, 1))));
    EXPECT_EQ(many.subLights().size(), 8u);

    // Broken probes and values: refused or ignored, never NaN.
    LightProbeImage bad;
    bad.width = 4;
    bad.height = 4;
    EXPECT_FALSE(many.buildSubLights(bad));
    probe = constantProbe(8, 4, Color(NAN, -1, INFINITY, 1));
    probe.texels[3] = Color(1, 1, 1, 1);
    ASSERT_TRUE(many.buildSubLights(probe));
    const Color c = many.illuminate({0, 0, 0}, {0, -1, 0}, ctx, false);
    EXPECT_TRUE(std::isfinite(c.r) && std::isfinite(c.g) && std::isfinite(c.b));
}

TEST(ImageBasedLight, ShadowedSubLights) {
    // Everything above z = 1 is hidden from the origin: the upper sub-lights are blocked.
    Blocker blocker = ceiling();
    EnvironmentValues v;
    v.iblSamples = 256;
    v.iblSwapYZ = true;  // the probe's up is +z
    KDHDRLight light(v);
    ASSERT_TRUE(light.buildSubLights(constantProbe(32, 16, Color(1, 1, 1, 1))));
    Random random(2);
    LightContext ctx;
    ctx.tracer = &blocker.tracer;
    ctx.random = &random;
    Color shadowed, unshadowed;
    light.illuminateBoth(shadowed, unshadowed, {0, 0, 0}, {0, 0, 1}, ctx);
    EXPECT_NEAR(unshadowed.r, 1.0f, 0.02f);
    EXPECT_EQ(shadowed.r, 0.0f);
    ctx.singleShadowRay = true;
    EXPECT_EQ(light.illuminate({0, 0, 0}, {0, 0, 1}, ctx, true).r, 0.0f);
    EXPECT_NEAR(light.illuminate({0, 0, 2}, {0, 0, 1}, ctx, true).r, 1.0f, 0.02f);
}

TEST(OtherLights, SurfaceDirectionClampToIntensityAndTracerSettings) {
    // Ambient and albedo lights keep their fixed directions; the area light (the square at
    // z = 1 facing down) points at its nearest point, straight up from under the square.
    EXPECT_EQ(AlbedoLight().directionToLightSurface({3, 2, 1}), Vec3(0, 0, 1));
    EXPECT_EQ(SimpleAmbientLight("a", Color()).directionToLightSurface({3, 2, 1}), Vec3(0, 1, 0));
    LightParameters p = whiteLight(LightType::kArea, downwardSquare(1.0f));
    p.falloffExponent = 2.0f;
    p.decayClampToOne = false;
    auto area = make<SimpleAreaLight>(p);
    const Vec3 side = area->directionToLightSurface({3, 0, 0});
    EXPECT_NEAR(side.x, -2.0f / std::sqrt(5.0f), 1e-6f);
    EXPECT_NEAR(side.z, 1.0f / std::sqrt(5.0f), 1e-6f);
    EXPECT_EQ(area->directionToLightSurface({0.5f, 0.2f, 0}), Vec3(0, 0, 1));

    // ClampToIntensity: (1 / d)^2 near the light is held at the colour.
    LightContext ctx;
    p.clampToIntensity = true;
    auto clamped = make<SimpleAreaLight>(p);
    const struct {
        float z, plain, clamped;
    } distances[] = {{0.5f, 4.0f, 1.0f}, {0.0f, 1.0f, 1.0f}, {-1.0f, 0.25f, 0.25f}};
    for (const auto &d : distances) {
        EXPECT_FLOAT_EQ(area->illuminate({0, 0, d.z}, {0, 0, 1}, ctx, false).r, d.plain);
        EXPECT_FLOAT_EQ(clamped->illuminate({0, 0, d.z}, {0, 0, 1}, ctx, false).r, d.clamped);
    }

    // The shadow tracer of a run from its render settings; unusable biases give the default.
    Blocker blocker = ceiling();
    OXConfig config;
    RenderSettingsBase &render = config.RenderSettings;
    render.minShadowRays = 3u;
    render.maxShadowRays = 40u;
    const ShadowTracer t = shadowTracerFor(render, &blocker.grid);
    EXPECT_EQ(t.ads, &blocker.grid);
    EXPECT_EQ(t.minShadowRays + t.maxShadowRays, 43u);
    for (float bias : {0.02f, 0.0f, -1.0f, NAN}) {
        render.bias = bias;
        EXPECT_EQ(shadowTracerFor(render, nullptr).bias, bias == 0.02f ? bias : 0.005f);
    }
}

TEST(OtherLights, EnvironmentOverTheHemisphere) {
    // A white upper, black lower gradient: the upward hemisphere's cosine-weighted mean of
    // ((1 + y) / 2)^2 is 17/24 straight up; a ceiling hides all of it.
    auto env =
        std::make_unique<GradientEnvironmentShader>("g", Color(1, 1, 1, 1), Color(0, 0, 0, 1));
    EnvironmentLight light("e", std::move(env), true);
    Blocker blocker({-5000, 1, -5000}, {5000, 1, -5000}, {5000, 1, 5000}, {-5000, 1, 5000});
    Random random(8);
    LightContext ctx;
    ctx.tracer = &blocker.tracer;
    ctx.random = &random;
    Color shadowed, unshadowed;
    light.illuminateBoth(shadowed, unshadowed, {0, 0, 0}, {0, 1, 0}, ctx);
    EXPECT_EQ(shadowed.r, 0.0f);
    EXPECT_NEAR(unshadowed.r, 17.0f / 24.0f, 0.01f);
    EXPECT_NEAR(light.illuminate({0, 2, 0}, {0, 1, 0}, ctx, true).r, 17.0f / 24.0f, 0.01f);
}

}  // namespace
}  // namespace ox
