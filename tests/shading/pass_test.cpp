#include "shading/pass.h"

#include <gtest/gtest.h>

#include <cmath>

#include "raytrace/complete_grid.h"
#include "shading/environment.h"
#include "shading/light.h"
#include "shading/trace.h"
#include "tests/shading/shading_fixture.h"
#include "tests/support/test_support.h"

namespace ox {
namespace {

using oxtest::World;

// A surface shader that records the mask it was asked to shade with.
class MaskRecorder final : public SurfaceShaderInterface {
public:
    MaskRecorder() : SurfaceShaderInterface("recorder") {}
    Color shade(ShadingContext &ctx) const override {
        ++calls;
        mask = ctx.componentMask;
        return Color(1, 1, 1, 1);
    }
    mutable int calls = 0;
    mutable uint32_t mask = 0;
};

TEST(Passes, StandardNamesAndTheirMasks) {
    constexpr uint32_t kAll = kShadeAll, kSh = kShadeShadows;
    const struct {
        const char *name;
        uint32_t mask;
    } cases[] = {
        {"beauty", kAll},
        {"color", kAll & ~kSh},
        {"specular", kAll & ~(kSh | kShadeDiffuse | kShadeAmbient | kShadeIncandescence)},
        {"diffuse", kAll & ~(kSh | kShadeSpecular | kShadeAmbient | kShadeIncandescence)},
        {"tpDiffuse", kShadeDiffuse | kSh},
        {"tpSpecular", kShadeSpecular | kSh},
        {"tpAmbient", kShadeAmbient | kSh},
        {"tpIncandescence", kShadeIncandescence | kSh},
        {"tpSss", kShadeSubSurface},
        {"tpReflections", kShadeReflections},
        {"tpRefractions", kShadeRefractions},
    };
    World w;
    MaskRecorder rec;
    for (const auto &c : cases) {
        SCOPED_TRACE(c.name);
        auto pass = createRenderPass(c.name);
        ASSERT_TRUE(pass);
        EXPECT_EQ(pass->name(), c.name);
        pass->shade(w.at({0, 0, 0}), rec);
        EXPECT_EQ(rec.mask, c.mask);
    }
    for (const char *other : {"Beauty", "beauty ", "tpalbedo", "", "tpIllumination"})
        EXPECT_FALSE(createRenderPass(other)) << other;
    EXPECT_TRUE(dynamic_cast<AlbedoPass *>(createRenderPass("tpAlbedo").get()));
    EXPECT_TRUE(dynamic_cast<ShadowPassOverride *>(createRenderPass("shadow").get()));

    // The set makes each pass once and also the passes of the run's settings.
    RenderPassSet set;
    RenderPass *b = set.find("beauty");
    EXPECT_EQ(set.find("beauty"), b);
    EXPECT_TRUE(set.find("tpIllumination"));
    EXPECT_EQ(set.find("tpRnm")->outputCount(), 3);
    EXPECT_EQ(set.find("tpRnm")->outputName(2), "tpRnm2");
    EXPECT_FALSE(set.find("BEAUTY"));
    EXPECT_EQ(set.size(), 3u);
}

TEST(Passes, MaskNoneAndSecondaryRays) {
    World w;
    MaskRecorder rec;
    MaskPass none("none", kShadeNone);
    ShadingContext &ctx = w.at({0, 0, 0});
    ctx.colorWeight = Color(1, 1, 1, 0.5f);
    EXPECT_EQ(none.shade(ctx, rec), Color(0, 0, 0, 0.5f));
    EXPECT_EQ(rec.calls, 0);

    // Full shading on GI rays when asked.
    MaskPass gi("gi", kShadeDiffuse, true);
    ShadingContext &g = w.at({0, 0, 0});
    g.rayType = kRayFinalGather;
    gi.shade(g, rec);
    EXPECT_EQ(rec.mask, kShadeAll);

    // Refractions pass: camera rays behind a refraction shade fully; reflected rays below the
    // depth limit add the component, at or beyond it shade fully.
    SecondaryPassOverride refr("r", SecondaryPassOverride::kRefractions, 2);
    ShadingContext &c = w.at({0, 0, 0});
    c.refractionDepth = 1;
    refr.shade(c, rec);
    EXPECT_EQ(rec.mask, kShadeAll);
    ShadingContext &s = w.at({0, 0, 0});
    s.rayType = kRayRefraction;
    s.componentMask = kShadeDiffuse;
    s.transparencyDepth = 1;
    refr.shade(s, rec);
    EXPECT_EQ(rec.mask, kShadeDiffuse | kShadeRefractions);
    s.transparencyDepth = 2;
    refr.shade(s, rec);
    EXPECT_EQ(rec.mask, kShadeAll);
}

TEST(Passes, ShadowRatioWithoutLightIsOne) {
    World w;
    PhongShader m("m", oxtest::diffuseMaterial(Color(1, 1, 1, 1)));
    EXPECT_EQ(ShadowPassOverride().shade(w.at({0, 0, 0}), m), Color::white());
    // A light that does not reach the point (behind it) gives 0 / 0 too.
    w.add(oxtest::directionalLight({0, 0, -1}));
    PhongParameters p = oxtest::diffuseMaterial(Color(1, 1, 1, 1));
    p.twosided = false;
    EXPECT_EQ(ShadowPassOverride().shade(w.at({0, 0, 0}), PhongShader("one", p)), Color::white());
}

// Blocks every shadow ray that runs towards +x.
class BlocksPlusX final : public ADSInterface {
public:
    bool intersect(const Ray &, Hit &, float, RayCounter *) const override { return false; }
    bool intersectSecond(const Ray &, Hit &, float, RayCounter *) const override { return false; }
    BBox bounds() const override { return {}; }
    bool occluded(const Ray &r, float, RayCounter *) const override { return r.direction.x > 0.0f; }
};

TEST(Passes, ShadowRatioAndShadowedMasks) {
    // Two equal lights at the same distance, the one towards +x blocked: half the light.
    World w;
    BlocksPlusX ads;
    w.scene.setRayTracing(&ads, 0.001f);
    w.add(oxtest::pointLight({1, 0, 1}, Color::white(), true));
    w.add(oxtest::pointLight({-1, 0, 1}, Color::white(), true));
    PhongShader m("m", oxtest::diffuseMaterial(Color(1, 1, 1, 1)));
    RenderPassSet passes;
    const Color s = passes.find("shadow")->shade(w.at({0, 0, 0}), m);
    EXPECT_NEAR(s.r, 0.5f, 1e-6f);
    EXPECT_EQ(s.a, 1.0f);
    // "tpDiffuse" is shadowed, "diffuse" and "color" are not.
    const float e = 1.0f / std::pow(2.0f, 1.5f);
    EXPECT_NEAR(passes.find("tpDiffuse")->shade(w.at({0, 0, 0}), m).r, e, 1e-5f);
    EXPECT_NEAR(passes.find("diffuse")->shade(w.at({0, 0, 0}), m).r, 2 * e, 1e-5f);
    EXPECT_NEAR(passes.find("color")->shade(w.at({0, 0, 0}), m).r, 2 * e, 1e-5f);
    EXPECT_NEAR(passes.find("beauty")->shade(w.at({0, 0, 0}), m).r, e, 1e-5f);
}

TEST(Passes, IlluminationModes) {
    World w;
    w.add(oxtest::directionalLight({0, 0, 1}, Color(0.5f, 0.5f, 0.5f)));
    MaskRecorder rec;
    IlluminationPass camera("tpIllumination", true);
    EXPECT_EQ(camera.shade(w.at({0, 0, 0}), rec), Color::white());
    IlluminationPass plain;
    EXPECT_EQ(plain.shade(w.at({0, 0, 0}), rec), Color(0.5f, 0.5f, 0.5f, 1));
    ShadingContext &g = w.at({0, 0, 0});
    g.rayType = kRayFinalGather;
    EXPECT_EQ(plain.shade(g, rec), Color(1, 1, 1, 1));
    EXPECT_EQ(rec.calls, 1);
}

TEST(Rnm, BasisIsOrthonormalAndSumsToOne) {
    for (int32_t basis : {RnmSettings::kUnrealEngine, RnmSettings::kUnrealEngineFlipped}) {
        Vec3 b[3];
        rnmBasis(basis, b);
        for (int i = 0; i < 3; ++i) {
            EXPECT_NEAR(b[i].length(), 1.0f, 1e-6f);
            EXPECT_NEAR(b[i].z, 0.5773503f, 1e-7f);
            for (int j = i + 1; j < 3; ++j) EXPECT_NEAR(dot(b[i], b[j]), 0.0f, 1e-6f);
        }
        Random r(7);
        for (int k = 0; k < 100; ++k) {
            const Vec3 v = Vec3(r.next() - 0.5f, r.next() - 0.5f, r.next() - 0.5f).normalized();
            float sum = 0.0f;
            for (const Vec3 &bi : b) sum += dot(bi, v) * dot(bi, v);
            EXPECT_NEAR(sum, 1.0f, 1e-5f);
        }
    }
}

TEST(Rnm, LightAlongNormalAndSideways) {
    MaskRecorder rec;
    World up;
    up.add(oxtest::directionalLight({0, 0, 1}));
    RnmSettings s;
    s.includeNormalComponent = true;
    RnmPass pass(s);
    ASSERT_EQ(pass.outputCount(), 4);
    Color out[4];
    pass.shadeAll(up.at({0, 0, 0}), rec, out);
    for (int i = 0; i < 3; ++i) EXPECT_NEAR(out[i].r, 0.5773503f, 1e-6f) << i;
    EXPECT_NEAR(out[3].r, 1.0f, 1e-6f);
    s.adjustIntensity = true;
    RnmPass adjusted(s);
    adjusted.shadeAll(up.at({0, 0, 0}), rec, out);
    EXPECT_NEAR((out[0].r + out[1].r + out[2].r) / 3.0f, 1.0f, 1e-5f);

    // Light along b2 - 0.5 b0 (normalised): 2 / sqrt(5) on the third basis vector, 0 on the
    // second and -1 / sqrt(5) on the first, which the modes keep or clamp. The flipped basis
    // puts the light in the second output; a flipped bitangent gives the same swap.
    Vec3 b[3];
    rnmBasis(RnmSettings::kUnrealEngine, b);
    World side;
    side.add(oxtest::directionalLight(b[2] - b[0] * 0.5f));
    const float hi = 2.0f / std::sqrt(5.0f), lo = -1.0f / std::sqrt(5.0f);
    const struct {
        int32_t basis, negative;
        float hand;
        float want[3];
    } cases[] = {
        {RnmSettings::kUnrealEngine, RnmSettings::kAllow, 1, {lo, 0, hi}},
        {RnmSettings::kUnrealEngine, RnmSettings::kDisallow, 1, {0, 0, hi}},
        {RnmSettings::kUnrealEngineFlipped, RnmSettings::kDisallow, 1, {0, hi, 0}},
        {RnmSettings::kUnrealEngine, RnmSettings::kDisallowCullHorizon, -1, {0, hi, 0}},
    };
    for (const auto &c : cases) {
        RnmSettings cs;
        cs.basis = c.basis;
        cs.allowNegative = c.negative;
        RnmPass p(cs);
        ShadingContext &ctx = side.at({0, 0, 0});
        ctx.surface.bitangent = Vec3(0, c.hand, 0);
        p.shadeAll(ctx, rec, out);
        for (int i = 0; i < 3; ++i) EXPECT_NEAR(out[i].g, c.want[i], 1e-5f) << i;
    }

    // A light below the horizon is culled, or kept when negative values are allowed.
    World below;
    below.add(oxtest::directionalLight({1, 0, -0.2f}));
    RnmSettings cull;
    RnmPass culling(cull);
    culling.shadeAll(below.at({0, 0, 0}), rec, out);
    EXPECT_EQ(out[0].r, 0.0f);
    cull.allowNegative = RnmSettings::kDisallow;
    RnmPass keeping(cull);
    keeping.shadeAll(below.at({0, 0, 0}), rec, out);
    EXPECT_GT(out[0].r, 0.5f);
}

TEST(Environment, GradientAndConstantWithTheRayWeight) {
    const Color upper(1.0f, 0.5f, 0.0f, 1), lower(0.0f, 0.2f, 1.0f, 1);
    GradientEnvironmentShader g("g", upper, lower);
    ShadingContext ctx;
    ctx.colorWeight = Color(1, 1, 1, 1);
    auto at = [&](const Vec3 &d) {
        ctx.rayDirection = d.normalized();
        return g.evaluate(ctx);
    };
    EXPECT_EQ(at({0, 1, 0}), upper);
    EXPECT_EQ(at({0, -1, 0}), lower);
    const Color h = at({1, 0, 0});
    EXPECT_FLOAT_EQ(h.r, 0.25f * upper.r + 0.25f * lower.r);
    EXPECT_FLOAT_EQ(h.b, 0.25f * upper.b + 0.25f * lower.b);
    // 45 degrees up: a = (0.5 y + 0.5)^2, b = (0.5 - 0.5 y)^2 with y = sqrt(1/2).
    const float y = std::sqrt(0.5f), a = (0.5f * y + 0.5f) * (0.5f * y + 0.5f),
                b = (0.5f - 0.5f * y) * (0.5f - 0.5f * y);
    const Color up45 = at({1, 1, 0});
    EXPECT_NEAR(up45.g, a * upper.g + b * lower.g, 1e-6f);
    const Color down45 = at({0, -1, 1});
    EXPECT_NEAR(down45.b, b * upper.b + a * lower.b, 1e-6f);
    ctx.colorWeight = Color(0.5f, 1, 2, 0.5f);
    EXPECT_EQ(at({0, 1, 0}), Color(0.5f, 0.5f, 0, 0.5f));

    ConstantEnvironmentShader c("c", Color(0.25f, 0.5f, 1, 1), 2.0f);
    EXPECT_EQ(c.evaluate(ctx), Color(0.25f, std::sqrt(0.5f) * 1.0f, 2, 0.5f));
}

TEST(Environment, RaysLeavingTheSceneSeeTheirEnvironment) {
    World w;
    ConstantEnvironmentShader rt("rt", Color(1, 0, 0, 1)), gi("gi", Color(0, 1, 0, 1));
    ShadingContext &ctx = w.at({0, 0, 0});
    EXPECT_EQ(environmentColor(ctx), Color::black());
    w.scene.rtEnvironment = &rt;
    w.scene.giEnvironment = &gi;
    EXPECT_EQ(environmentColor(ctx), Color(1, 0, 0, 1));
    ctx.rayType = kRayFinalGather;
    EXPECT_EQ(environmentColor(ctx), Color(0, 1, 0, 1));

    // "Camera" and "None" give no environment; SkyLight a shared constant one.
    Environment env;
    EnvironmentValues v;
    std::string error;
    ASSERT_TRUE(env.create(v, error));
    EXPECT_EQ(env.rtShader(), nullptr);
    v.rtEnvironment = v.giEnvironment = int32_t(EnvironmentKind::kSkyLight);
    v.skyLightColor = Color(0.5f, 0.5f, 0.5f, 1);
    ASSERT_TRUE(env.create(v, error));
    EXPECT_EQ(env.rtShader(), env.giShader());
    EXPECT_EQ(env.rtShader()->name(), "ConstantEnvShader((0.5000, 0.5000, 0.5000, 1.0000))");
    // A probe that cannot be read fails the environment, naming the file.
    v.giEnvironment = int32_t(EnvironmentKind::kIBL);
    v.iblImageFile = "/no/such/probe.hdr";
    oxtest::captureOutput([&] { EXPECT_FALSE(Environment().create(v, error)); });
    EXPECT_NE(error.find("/no/such/probe.hdr"), std::string::npos) << error;
}

TEST(Environment, ProbeLookupAndGIBlur) {
    // The probe's UV for the axes: up is v = 1, down v = 0, +x u = 0, +z u = 0.25.
    EXPECT_NEAR(probeUV({0, 1, 0}, 0, false).y, 1.0f, 1e-6f);
    EXPECT_NEAR(probeUV({0, -1, 0}, 0, false).y, 0.0f, 1e-6f);
    EXPECT_NEAR(probeUV({0, 0, 1}, 0, true).y, 1.0f, 1e-6f);
    EXPECT_NEAR(probeUV({1, 0, 0}, 0, false).x, 0.0f, 1e-6f);
    EXPECT_NEAR(probeUV({0, 0, 1}, 0, false).x, 0.25f, 1e-6f);
    EXPECT_NEAR(probeUV({0, 0, -1}, 3.14159265f / 2, false).x, 0.5f, 1e-6f);
    const Vec2 bad = probeUV({NAN, 0, 0}, 0, false);
    EXPECT_TRUE(bad.x >= 0.0f && bad.x < 1.0f && bad.y >= 0.0f && bad.y <= 1.0f);
    // The environment sees the probe where the image-based light put it: the inverse of the
    // light's layout, turned and swapped as the light does.
    for (float turn : {0.0f, 0.7f})
        for (bool swap : {false, true})
            for (float u : {0.1f, 0.3f, 0.6f, 0.95f})
                for (float v : {0.2f, 0.5f, 0.8f}) {
                    Vec3 d = probeDirection(u, v);
                    d = Vec3(d.x * std::cos(turn) - d.z * std::sin(turn), d.y,
                             d.x * std::sin(turn) + d.z * std::cos(turn));
                    if (swap) std::swap(d.y, d.z);
                    const Vec2 uv = probeUV(d, turn, swap);
                    EXPECT_NEAR(uv.x, u, 1e-5f) << turn << swap << u << v;
                    EXPECT_NEAR(uv.y, v, 1e-5f) << turn << swap << u << v;
                }

    // GI rays read the probe with the blur footprint, other rays with none.
    struct Footprint final : OXTexture {
        Color lookup(const TextureLookup &at) const override {
            return Color(at.dudx, at.dvdy, 1, 1);
        }
        bool readPixels(const Region &, Color *) const override { return false; }
        Vec2i resolution() const override { return {1, 1}; }
        bool isHDR() const override { return false; }
    };
    IBLEnvironmentShader ibl("IBLEnv_p", "p.hdr", 0.0f, false, 0.05f);
    ShadingContext ctx;
    EXPECT_EQ(ibl.evaluate(ctx), Color(0, 0, 0, 1));
    ibl.setProbe(std::make_shared<Footprint>());
    EXPECT_EQ(ibl.evaluate(ctx), Color(0, 0, 1, 1));
    ctx.rayType = kRayFinalGather;
    EXPECT_EQ(ibl.evaluate(ctx), Color(0.05f, 0.05f, 1, 1));
}

}  // namespace
}  // namespace ox
