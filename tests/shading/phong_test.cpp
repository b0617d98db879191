#include "shading/phong.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <string>
#include <vector>

#include "raytrace/complete_grid.h"
#include "shading/environment.h"
#include "shading/pass.h"
#include "shading/trace.h"
#include "tests/shading/shading_fixture.h"
#include "tests/support/tga_file.h"

namespace ox {
namespace {

using oxtest::ConstantTexture;
using oxtest::World;

constexpr float kPi = 3.14159265358979f;

TEST(PhongClosedForm, PointLightOverPlane) {
    // A point light at height h over the plane z = 0: E(x) = h / (h^2 + x^2)^1.5.
    const float h = 1.0f;
    World w;
    w.add(oxtest::pointLight({0, 0, h}));
    RenderPassSet passes;
    for (float albedo : {1.0f, 0.5f}) {
        PhongShader m("m", oxtest::diffuseMaterial(Color(albedo, albedo, albedo, 1)));
        for (float x : {0.0f, 0.5f, 1.0f, 2.0f, 5.0f}) {
            const float e = h / std::pow(h * h + x * x, 1.5f);
            SCOPED_TRACE(testing::Message() << "albedo " << albedo << " x " << x);
            const Color beauty = passes.find("beauty")->shade(w.at({x, 0, 0}), m);
            EXPECT_NEAR(beauty.r, albedo * e, 1e-5f * e);
            EXPECT_NEAR(beauty.b, albedo * e, 1e-5f * e);
            EXPECT_EQ(beauty.a, 1.0f);
            const Color ill = passes.find("tpIllumination")->shade(w.at({x, 0, 0}), m);
            EXPECT_NEAR(ill.g, e, 1e-5f * e);
            EXPECT_EQ(ill.a, 1.0f);
            const Color alb = passes.find("tpAlbedo")->shade(w.at({x, 0, 0}), m);
            EXPECT_EQ(alb, Color(albedo, albedo, albedo, 1));
            // Without shadow casters every point is unshadowed.
            EXPECT_EQ(passes.find("shadow")->shade(w.at({x, 0, 0}), m), Color::white());
        }
    }
}

TEST(PhongClosedForm, BeautyIsAlbedoTimesIllumination) {
    // A textured diffuse material under two lights of different colours, seen at an angle.
    World w;
    w.add(oxtest::pointLight({0.3f, -0.2f, 2.0f}, Color(1.0f, 0.6f, 0.2f)));
    w.add(oxtest::directionalLight({1, 1, 2}, Color(0.2f, 0.3f, 0.9f)));
    PhongParameters p;
    p.channels[kPhongDiffuse].textureFile = "albedo.tga";
    p.channels[kPhongDiffuse].texture =
        std::make_shared<ConstantTexture>(Color(0.8f, 0.5f, 0.1f, 1));
    PhongShader m("m", p);
    RenderPassSet passes;
    for (float x : {-1.0f, 0.0f, 0.7f}) {
        const Vec3 dir = Vec3(0.3f, 0.1f, -1.0f).normalized();
        const Color beauty = passes.find("beauty")->shade(w.at({x, 0.2f, 0}, dir), m);
        const Color albedo = passes.find("tpAlbedo")->shade(w.at({x, 0.2f, 0}, dir), m);
        const Color ill = passes.find("tpIllumination")->shade(w.at({x, 0.2f, 0}, dir), m);
        EXPECT_NEAR(beauty.r, albedo.r * ill.r, 1e-6f);
        EXPECT_NEAR(beauty.g, albedo.g * ill.g, 1e-6f);
        EXPECT_NEAR(beauty.b, albedo.b * ill.b, 1e-6f);
        EXPECT_GT(beauty.b, 0.0f);
    }
}

TEST(PhongClosedForm, SpecularHighlightPeaksAtMirrorDirection) {
    // Specular only: s = cos(delta)^shininess, delta = angle between the mirrored view
    // direction and the direction to the light.
    World w;
    const Vec3 toLight = Vec3(1, 0, 1).normalized();
    w.add(oxtest::directionalLight(toLight));
    for (float shininess : {10.0f, 50.0f}) {
        PhongParameters p;
        p.shininess = shininess;
        p.channels[kPhongSpecular].color = Color(1, 1, 1, 1);
        PhongShader m("m", p);
        MaskPass pass("tpSpecular", kShadeSpecular | kShadeShadows);
        // The view direction whose mirror image is the light direction, turned by delta in the
        // plane of incidence.
        auto view = [&](float delta) {
            const float a = kPi / 4 + delta;  // angle of the mirrored ray from the normal
            return Vec3(std::sin(a), 0, -std::cos(a));
        };
        EXPECT_NEAR(pass.shade(w.at({0, 0, 0}, view(0.0f)), m).r, 1.0f, 1e-5f);
        // Half maximum at cos(delta)^n = 0.5, on both sides of the peak.
        const float half = std::acos(std::pow(0.5f, 1.0f / shininess));
        EXPECT_NEAR(pass.shade(w.at({0, 0, 0}, view(half)), m).r, 0.5f, 1e-4f);
        EXPECT_NEAR(pass.shade(w.at({0, 0, 0}, view(-half)), m).r, 0.5f, 1e-4f);
        const float off = pass.shade(w.at({0, 0, 0}, view(0.2f)), m).r;
        EXPECT_NEAR(off, std::pow(std::cos(0.2f), shininess), 1e-4f);
        // A light below the surface gives no highlight.
        World below;
        below.add(oxtest::directionalLight({1, 0, -1}));
        EXPECT_EQ(pass.shade(below.at({0, 0, 0}, view(0.0f)), m).r, 0.0f);
    }
}

TEST(PhongChannels, EvaluationSteps) {
    World w;
    ShadingContext &ctx = w.at({0, 0, 0});
    struct Case {
        const char *what;
        MaterialChannel ch;
        Color want;
    };
    auto channel = [](Color c, float scale, bool clamp, bool invert,
                      std::array<uint8_t, 4> swz = {255, 1, 2, 3}) {
        MaterialChannel ch;
        ch.color = c;
        ch.scale = scale;
        ch.clamp = clamp;
        ch.invert = invert;
        for (int i = 0; i < 4; ++i) ch.swizzle[i] = swz[size_t(i)];
        return ch;
    };
    const Case cases[] = {
        {"scale leaves alpha", channel({0.5f, 1, 2, 0.5f}, 2, false, false), {1, 2, 4, 0.5f}},
        {"clamp then invert", channel({1.5f, -1, 0.25f, 2}, 1, true, true), {0, 1, 0.75f, 0}},
        {"swizzle",
         channel({0.1f, 0.2f, 0.3f, 0.4f}, 1, false, false, {3, 0, 0, 2}),
         {0.4f, 0.1f, 0.1f, 0.3f}},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.what);
        const Color got = evaluateChannel(c.ch, ctx);
        EXPECT_FLOAT_EQ(got.r, c.want.r);
        EXPECT_FLOAT_EQ(got.g, c.want.g);
        EXPECT_FLOAT_EQ(got.b, c.want.b);
        EXPECT_FLOAT_EQ(got.a, c.want.a);
    }

    // Vertex colour, a texture at the chosen UV set (set 0 for a set the point does not
    // have), a texture that failed to load.
    MaterialChannel vc;
    vc.useVertexColor = true;
    vc.color = Color(0.1f, 0.1f, 0.1f, 1);
    ctx.surface.color = Color(0.3f, 0.2f, 0.1f, 1);
    EXPECT_EQ(evaluateChannel(vc, ctx), ctx.surface.color);

    auto tex = std::make_shared<ConstantTexture>(Color(0.2f, 0.4f, 0.6f, 1));
    MaterialChannel tc;
    tc.textureFile = "t.tga";
    tc.texture = tex;
    tc.uvSet = 1;
    ctx.surface.uvSetCount = 2;
    ctx.surface.uvs[1].uv = Vec2(0.25f, 0.75f);
    EXPECT_EQ(evaluateChannel(tc, ctx), Color(0.2f, 0.4f, 0.6f, 1));
    EXPECT_EQ(tex->lastUv, Vec2(0.25f, 0.75f));
    tc.uvSet = 5;
    evaluateChannel(tc, ctx);
    EXPECT_EQ(tex->lastUv, ctx.surface.uvs[0].uv);
    tc.texture = std::make_shared<ConstantTexture>(Color(0.5f, NAN, 0.5f, 1));
    EXPECT_EQ(evaluateChannel(tc, ctx), Color(0, 0, 0, 1));
    tc.texture.reset();
    EXPECT_EQ(evaluateChannel(tc, ctx), Color(0, 0, 0, 1));
}

TEST(PhongChannels, BadValuesAreMendedWithWarnings) {
    PhongParameters p;
    p.channels[kPhongDiffuse].swizzle[0] = 0;
    p.channels[kPhongDiffuse].swizzle[2] = 7;
    p.channels[kPhongSpecular].scale = NAN;
    p.shininess = -3.0f;
    testing::internal::CaptureStdout();
    PhongShader m("bad", p);
    const std::string out = testing::internal::GetCapturedStdout();
    EXPECT_NE(out.find("Material bad: Diffuse swizzle (0, 1, 7, 3) names a channel above 3"),
              std::string::npos);
    EXPECT_NE(out.find("Specular Scale is not a finite number"), std::string::npos);
    EXPECT_NE(out.find("Shininess -3 is negative"), std::string::npos);
    EXPECT_EQ(m.parameters().channels[kPhongDiffuse].swizzle[0], 255);
    EXPECT_EQ(m.parameters().channels[kPhongSpecular].scale, 1.0f);
    EXPECT_EQ(m.parameters().shininess, 0.0f);
}

TEST(PhongNormalMap, FlatAndTiltedInBothHandednesses) {
    // A light 60 degrees from the normal towards +x (the tangent) or +y.
    const float beta = kPi / 3;
    const float tilt = 0.3f;
    auto normalMap = [](const Color &c) {
        PhongParameters p = oxtest::diffuseMaterial(Color(1, 1, 1, 1));
        p.channels[kPhongNormal].textureFile = "n.tga";
        p.channels[kPhongNormal].texture = std::make_shared<ConstantTexture>(c);
        return p;
    };
    MaskPass diffuse("tpDiffuse", kShadeDiffuse | kShadeShadows);

    World wx;
    wx.add(oxtest::directionalLight({std::sin(beta), 0, std::cos(beta)}));
    PhongShader plain("plain", oxtest::diffuseMaterial(Color(1, 1, 1, 1)));
    PhongShader flat("flat", normalMap(Color(0.5f, 0.5f, 1.0f, 1)));
    EXPECT_NEAR(diffuse.shade(wx.at({0, 0, 0}), flat).r, diffuse.shade(wx.at({0, 0, 0}), plain).r,
                1e-6f);
    EXPECT_NEAR(diffuse.shade(wx.at({0, 0, 0}), plain).r, std::cos(beta), 1e-6f);

    // Red tilts towards the tangent: the light is then (beta - tilt) from the normal.
    PhongShader towardsT(
        "t", normalMap(Color(0.5f + 0.5f * std::sin(tilt), 0.5f, 0.5f + 0.5f * std::cos(tilt), 1)));
    EXPECT_NEAR(diffuse.shade(wx.at({0, 0, 0}), towardsT).r, std::cos(beta - tilt), 1e-5f);

    // Green tilts towards the bitangent, whichever way the frame is handed.
    PhongShader towardsB(
        "b", normalMap(Color(0.5f, 0.5f + 0.5f * std::sin(tilt), 0.5f + 0.5f * std::cos(tilt), 1)));
    for (float hand : {1.0f, -1.0f}) {
        SCOPED_TRACE(hand);
        World wy;
        wy.add(oxtest::directionalLight({0, hand * std::sin(beta), std::cos(beta)}));
        ShadingContext &ctx = wy.at({0, 0, 0});
        ctx.surface.bitangent = Vec3(0, hand, 0);
        EXPECT_NEAR(diffuse.shade(ctx, towardsB).r, std::cos(beta - tilt), 1e-5f);
        const PhongShadingSample s(towardsB.parameters(), ctx);
        EXPECT_NEAR(dot(s.normal(), Vec3(0, 0, 1)), std::cos(tilt), 1e-5f);
        EXPECT_NEAR(s.normal().y, hand * std::sin(tilt), 1e-5f);
    }
}

TEST(PhongShading, TwoSidedAndLightLinks) {
    World w;
    w.add(oxtest::directionalLight({0, 0, -1}));  // lights the back of the plane
    PhongParameters p = oxtest::diffuseMaterial(Color(1, 1, 1, 1));
    ShadingContext &ctx = w.at({0, 0, 0}, {0, 0, 1});
    EXPECT_NEAR(PhongShader("two", p).shade(ctx).r, 1.0f, 1e-6f);
    p.twosided = false;
    EXPECT_EQ(PhongShader("one", p).shade(ctx).r, 0.0f);

    // Light linking: the instance's row leaves the light out.
    p.twosided = true;
    const uint64_t rows[2] = {0x0, 0x1};
    w.scene.lightLinks = rows;
    w.scene.lightLinkWords = 1;
    w.scene.lightLinkInstances = 2;
    PhongShader m("m", p);
    for (uint32_t instance : {0u, 1u, 7u}) {
        ShadingContext &c = w.at({0, 0, 0}, {0, 0, 1});
        c.surface.instanceIndex = instance;
        EXPECT_EQ(m.shade(c).r, instance == 0 ? 0.0f : 1.0f) << instance;
    }
    w.scene.settings.ignoreLightLinks = true;
    ShadingContext &c = w.at({0, 0, 0}, {0, 0, 1});
    c.surface.instanceIndex = 0;
    EXPECT_EQ(m.shade(c).r, 1.0f);
}

TEST(PhongShading, AmbientLightFeedsAmbientOnly) {
    World w;
    w.add(std::make_unique<SimpleAmbientLight>("amb", Color(0.25f, 0.25f, 0.25f, 1)));
    PhongShader m("m", oxtest::diffuseMaterial(Color(1, 1, 1, 1)));
    MaskPass diffuse("tpDiffuse", kShadeDiffuse | kShadeShadows);
    MaskPass ambient("tpAmbient", kShadeAmbient | kShadeShadows);
    // Cosine 1 whatever the normal; nothing in the diffuse pass.
    ShadingContext &ctx = w.at({0, 0, 0});
    ctx.surface.normal = Vec3(1, 0, 0);
    EXPECT_FLOAT_EQ(ambient.shade(ctx, m).r, 0.25f);
    EXPECT_EQ(diffuse.shade(w.at({0, 0, 0}), m).r, 0.0f);
    EXPECT_FLOAT_EQ(m.shade(w.at({0, 0, 0})).r, 0.25f);
}

// An acceleration structure in which every ray hits something at distance 1.
class AlwaysHit final : public ADSInterface {
public:
    bool intersect(const Ray &, Hit &hit, float, RayCounter *) const override {
        hit.t = 1.0f;
        return true;
    }
    bool intersectSecond(const Ray &r, Hit &h, float t, RayCounter *c) const override {
        return intersect(r, h, t, c);
    }
    BBox bounds() const override { return {}; }
    bool occluded(const Ray &, float, RayCounter *) const override { return true; }
};

// Every hit shows the same material, on the plane's front; counts the hits resolved.
class SameMaterial final : public HitResolverInterface {
public:
    explicit SameMaterial(const SurfaceShaderInterface &m) : m_(m) {}
    const SurfaceShaderInterface *resolve(const Ray &ray, const Hit &,
                                          ShadingContext &ctx) const override {
        ++count;
        ctx.surface.geometricNormal = ctx.surface.normal = Vec3(0, 0, 1);
        ctx.surface.backSide = dot(ray.direction, ctx.surface.geometricNormal) > 0.0f;
        return &m_;
    }
    mutable int count = 0;

private:
    const SurfaceShaderInterface &m_;
};

TEST(PhongSecondary, TransparencyConservesEnergyAndStopsAtTheDepthLimit) {
    // Half transparent, white diffuse, lit with 1 from above, over a constant environment of 0.4:
    // half of each, never more than the two together.
    World w;
    w.add(oxtest::directionalLight({0, 0, 1}));
    ConstantEnvironmentShader env("env", Color(0.4f, 0.4f, 0.4f, 1));
    w.scene.rtEnvironment = &env;
    PhongParameters p = oxtest::diffuseMaterial(Color(1, 1, 1, 1));
    p.channels[kPhongTransparency].color = Color(0.5f, 0.5f, 0.5f, 0.5f);
    PhongShader m("glass", p);
    EXPECT_NEAR(m.shade(w.at({0, 0, 0})).r, 0.5f * 1.0f + 0.5f * 0.4f, 1e-6f);

    // Diffuse alpha as transparency: alpha 0.25 lets 75% through.
    PhongParameters q = oxtest::diffuseMaterial(Color(1, 1, 1, 0.25f));
    q.diffuseAlphaAsTransparency = true;
    EXPECT_NEAR(PhongShader("leaf", q).shade(w.at({0, 0, 0})).r, 0.25f + 0.75f * 0.4f, 1e-6f);

    // An endless stack of such surfaces: the transparency rays stop at the depth limit.
    AlwaysHit ads;
    SameMaterial resolver(m);
    w.scene.ads = &ads;
    w.scene.resolver = &resolver;
    for (uint32_t limit : {0u, 3u, 50u}) {
        w.scene.settings.transparencyDepth = limit;
        w.scene.settings.refractionThreshold = 0.0f;
        resolver.count = 0;
        const Color c = m.shade(w.at({0, 0, 0}));
        EXPECT_EQ(resolver.count, int(limit));
        // Layer k adds 0.5^(k+1) of the light: a geometric sum below 1.
        EXPECT_NEAR(c.r, 1.0f - std::pow(0.5f, float(limit + 1)), 1e-5f);
        EXPECT_EQ(c.a, 1.0f);
    }
    // A depth beyond what a context can count stops at 255 layers.
    p.channels[kPhongTransparency].color = Color(0.99f, 0.99f, 0.99f, 1);
    PhongShader clear("clear", p);
    SameMaterial clearResolver(clear);
    w.scene.resolver = &clearResolver;
    w.scene.settings.transparencyDepth = 100000;
    const Color c = clear.shade(w.at({0, 0, 0}));
    EXPECT_EQ(clearResolver.count, 255);
    EXPECT_NEAR(c.r, 1.0f - std::pow(0.99f, 256.0f), 1e-4f);
}

TEST(PhongSecondary, ReflectionsSeeTheEnvironmentUpToTheDepth) {
    World w;
    ConstantEnvironmentShader env("env", Color(0.8f, 0.6f, 0.4f, 1));
    w.scene.rtEnvironment = &env;
    PhongParameters p;
    p.channels[kPhongReflection].color = Color(0.5f, 0.5f, 0.5f, 1);
    PhongShader mirror("mirror", p);
    const Color c = mirror.shade(w.at({0, 0, 0}, Vec3(1, 0, -1)));
    EXPECT_NEAR(c.r, 0.4f, 1e-6f);
    EXPECT_NEAR(c.b, 0.2f, 1e-6f);
    // Masked out: nothing.
    MaskPass diffuse("tpDiffuse", kShadeDiffuse | kShadeShadows);
    EXPECT_EQ(diffuse.shade(w.at({0, 0, 0}), mirror).r, 0.0f);

    AlwaysHit ads;
    SameMaterial resolver(mirror);
    w.scene.ads = &ads;
    w.scene.resolver = &resolver;
    w.scene.settings.reflectionDepth = 4;
    w.scene.settings.reflectionThreshold = 0.0f;
    mirror.shade(w.at({0, 0, 0}));
    EXPECT_EQ(resolver.count, 4);
    w.scene.settings.reflectionDepth = 100;  // capped at 10, and by maxRayDepth 6
    resolver.count = 0;
    mirror.shade(w.at({0, 0, 0}));
    EXPECT_EQ(resolver.count, 6);
}

TEST(PhongShading, DummyAndMissingMaterialAreOpaqueBlack) {
    DummySurfaceShader d;
    World w;
    EXPECT_EQ(d.shade(w.at({0, 0, 0})), Color(0, 0, 0, 1));
    EXPECT_EQ(d.albedo(w.at({0, 0, 0})), Color(0, 0, 0, 1));
}

}  // namespace
}  // namespace ox

namespace ox {
namespace {

TEST(PhongTextures, ChannelsLoadThroughTheTextureManager) {
    const std::string dir = testing::TempDir();
    const std::string file = dir + "/phong_texture_test.tga";
    // Left texel red, right texel blue (one row).
    ASSERT_TRUE(oxtest::writeTGA(file, 2, 1, {{255, 0, 0}, {0, 0, 255}}));
    TextureFactory textures;
    PhongParameters p;
    p.channels[kPhongDiffuse].textureFile = file;
    p.channels[kPhongEmissive].textureFile = dir + "/no_such_texture.tga";
    testing::internal::CaptureStdout();
    loadChannelTextures("wall", p, textures);
    const std::string out = testing::internal::GetCapturedStdout();
    EXPECT_NE(out.find("Failed to create texture " + dir +
                       "/no_such_texture.tga for the Emissive channel of material wall, it will "
                       "be rendered as black"),
              std::string::npos);
    ASSERT_TRUE(p.channels[kPhongDiffuse].texture);
    EXPECT_FALSE(p.channels[kPhongEmissive].texture);

    PhongShader m("wall", p);
    World w;
    const Color left = m.albedo(w.at({0.25f, 0.5f, 0}));
    const Color right = m.albedo(w.at({0.75f, 0.5f, 0}));
    EXPECT_NEAR(left.r, 1.0f, 1e-3f);
    EXPECT_NEAR(left.b, 0.0f, 1e-3f);
    EXPECT_NEAR(right.r, 0.0f, 1e-3f);
    EXPECT_NEAR(right.b, 1.0f, 1e-3f);
    // The failed channel shades as opaque black (no light, no emission).
    MaskPass incandescence("tpIncandescence", kShadeIncandescence | kShadeShadows);
    EXPECT_EQ(incandescence.shade(w.at({0.25f, 0.5f, 0}), m), Color(0, 0, 0, 1));
    std::remove(file.c_str());
}

}  // namespace
}  // namespace ox

#include "raytrace/instance.h"
#include "raytrace/render_stats.h"
#include "shading/material.h"

namespace ox {
namespace {

TEST(PhongSecondary, ReflectionsMeetSceneInstances) {
    // A glowing quad at z = 1 facing down, seen in a half-reflecting mirror at z = 0: the
    // mirror shows half of the quad's incandescence; beside the quad, the environment.
    PhongParameters glow;
    glow.channels[kPhongEmissive].color = Color(0.5f, 0.25f, 1.0f, 1);
    MaterialTable table;
    const Material *m = table.insert(
        std::make_unique<Material>(std::make_unique<PhongShader>("glow", glow), nullptr));
    Shape quad("quad");
    quad.vertices().resize(4, 0, false);
    const Vec3 corners[4] = {{-1, -1, 1}, {1, -1, 1}, {1, 1, 1}, {-1, 1, 1}};
    for (uint32_t i = 0; i < 4; ++i) {
        quad.vertices().setPosition(i, corners[i]);
        quad.vertices().normal(i) = Vec3(0, 0, -1);
    }
    quad.triangles() = {Triangle{{0, 2, 1}, 0}, Triangle{{0, 3, 2}, 0}};
    quad.materials() = {m};
    quad.computeBounds();
    auto instance = Instance::create("quad", Mtx4(), &quad, nullptr, RenderStats::kDefault);
    ASSERT_TRUE(instance);
    CompleteGrid grid;
    ASSERT_TRUE(grid.build({instanceInput(*instance, 0)}, ADSParameters()));
    const Instance *instances[1] = {instance.get()};

    World w;
    ConstantEnvironmentShader env("env", Color(0.2f, 0.2f, 0.2f, 1));
    w.scene.rtEnvironment = &env;
    w.scene.setRayTracing(&grid, 0.001f);
    w.scene.grid = &grid;
    w.scene.instances = instances;
    w.scene.instanceCount = 1;
    PhongParameters p;
    p.channels[kPhongReflection].color = Color(0.5f, 0.5f, 0.5f, 1);
    PhongShader mirror("mirror", p);
    const Color c = mirror.shade(w.at({0.2f, 0.1f, 0}, Vec3(0.1f, 0, -1)));
    EXPECT_NEAR(c.r, 0.25f, 1e-6f);
    EXPECT_NEAR(c.g, 0.125f, 1e-6f);
    EXPECT_NEAR(c.b, 0.5f, 1e-6f);
    const Color out = mirror.shade(w.at({3, 0, 0}, Vec3(1, 0, -1)));
    EXPECT_NEAR(out.r, 0.1f, 1e-6f);
}

}  // namespace
}  // namespace ox
