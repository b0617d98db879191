#include <gtest/gtest.h>

#include <atomic>
#include <cfloat>
#include <cmath>
#include <thread>

#include "core/message.h"
#include "shading/environment.h"
#include "shading/light.h"
#include "shading/material.h"
#include "shading/phong.h"
#include "tests/support/test_support.h"
#include "texture/texture_factory.h"

namespace ox {
namespace {

TEST(Attenuation, ModelsAndRamps) {
    ClampedStandardAttenuation clamped(2.0f);
    StandardAttenuation standard(2.0f);
    EXPECT_FLOAT_EQ(clamped.attenuate(0.5f), 1.0f);
    EXPECT_FLOAT_EQ(standard.attenuate(0.5f), 4.0f);
    EXPECT_FLOAT_EQ(clamped.attenuate(2.0f), 0.25f);

    // Entries out of order are sorted by position; a NaN position is dropped.
    LightRamp ramp({{0, 0, 1, 1.0f}, {1, 0, 0, 0.0f}, {9, 9, 9, NAN}, {0, 1, 0, 0.5f}});
    ASSERT_EQ(ramp.positions(), (std::vector<float>{0.0f, 0.5f, 1.0f}));
    EXPECT_EQ(ramp.lookup(-1.0f), Color(1, 0, 0, 1));
    EXPECT_EQ(ramp.lookup(2.0f), Color::black());
    EXPECT_EQ(ramp.lookup(0.0f), Color(1, 0, 0, 1));
    Color mid = ramp.lookup(0.75f);
    EXPECT_FLOAT_EQ(mid.g, 0.5f);
    EXPECT_FLOAT_EQ(mid.b, 0.5f);
    EXPECT_EQ(LightRamp().lookup(0.3f), Color::white());
    // Two entries closer than 0.0001 give the lower colour.
    LightRamp steep({{1, 0, 0, 0.5f}, {0, 1, 0, 0.50005f}});
    EXPECT_EQ(steep.lookup(0.50002f), Color(1, 0, 0, 1));
}

TEST(Lights, ConstructionByType) {
    LightParameters p;
    p.name = "l";
    p.color = Color(1, 0.5f, 0.25f, 1);
    p.objectToWorld = Mtx4::translation({1, 2, 3});
    p.decayCutoff = 10.0f;
    p.photonIntensity = 2.0f;
    p.shadowSamples = 1000;
    p.directLightScale = 3.0f;
    p.indirectLightScale = 0.5f;
    bool shadows = false;

    p.type = LightType::kPoint;
    auto point = createLight(p, shadows);
    ASSERT_STREQ(point->className(), "SimplePointLight");
    auto &pl = static_cast<SimplePointLight &>(*point);
    EXPECT_EQ(pl.position(), Vec3(1, 2, 3));
    EXPECT_EQ(pl.bounds(), BBox(Vec3(-9, -8, -7), Vec3(11, 12, 13)));
    EXPECT_TRUE(dynamic_cast<const ClampedStandardAttenuation *>(pl.attenuation()));
    EXPECT_EQ(pl.shadowSampler().samples, 256u);
    EXPECT_EQ(pl.flags(), kLightDiffuse | kLightSpecular | kLightShadows);
    EXPECT_EQ(pl.intensityScale(0), 3.0f);
    EXPECT_EQ(pl.intensityScale(5), 0.5f);
    EXPECT_EQ(pl.intensityScale(3), 1.0f);
    EXPECT_FLOAT_EQ(pl.photonEmission().power.r, 24.0f);

    p.attenuationType = AttenuationType::kUnreal;
    p.castShadows = false;
    auto unreal = createLight(p, shadows);
    EXPECT_FALSE(shadows);
    EXPECT_FALSE(unreal->hasFlag(kLightShadows));
    auto *u = dynamic_cast<const UnrealAttenuation *>(
        static_cast<SimplePointLight &>(*unreal).attenuation());
    ASSERT_TRUE(u);
    EXPECT_EQ(u->radius(), 10.0f);
    p.attenuationType = AttenuationType::kStandard;
    p.decayClampToOne = false;
    auto standard = createLight(p, shadows);
    EXPECT_TRUE(dynamic_cast<const StandardAttenuation *>(
        static_cast<SimplePointLight &>(*standard).attenuation()));

    // Directional: no attenuation, the direction towards the light, photons x 300.
    p.type = LightType::kDirectional;
    auto dir = createLight(p, shadows);
    auto &dl = static_cast<SimpleDirectionalLight &>(*dir);
    EXPECT_EQ(dl.attenuation(), nullptr);
    EXPECT_EQ(dl.direction(), Vec3(0, 1, 0));
    EXPECT_FLOAT_EQ(dl.photonEmission().power.r, 600.0f);

    // Spot: a negative penumbra narrows the inner cone.
    p.type = LightType::kSpot;
    p.spotLightConeAngle = 60.0f;
    p.spotLightPenumbraAngle = -10.0f;
    auto spot = createLight(p, shadows);
    auto &sl = static_cast<SimpleSpotLight &>(*spot);
    EXPECT_NEAR(sl.cosOuter(), std::cos(30.0f * 3.14159265f / 180), 1e-6f);
    EXPECT_NEAR(sl.cosInner(), std::cos(20.0f * 3.14159265f / 180), 1e-6f);
    p.spotLightPenumbraAngle = 10.0f;
    auto wide = createLight(p, shadows);
    EXPECT_NEAR(static_cast<SimpleSpotLight &>(*wide).cosOuter(),
                std::cos(40.0f * 3.14159265f / 180), 1e-6f);
    EXPECT_EQ(sl.axis(), Vec3(0, -1, 0));
    // A gobo that cannot be read: the light works without it.
    p.spotLightGoboTexture = "/no/such/gobo.tga";
    std::string out = oxtest::captureOutput([&] {
        auto g = createLight(p, shadows);
        EXPECT_FALSE(static_cast<SimpleSpotLight &>(*g).hasGobo());
    });
    EXPECT_NE(out.find("[ERROR]    Gobo file /no/such/gobo.tga failed to load"), std::string::npos);

    // Area lights get an attenuation although they have no ramp.
    p.type = LightType::kArea;
    p.lightRampColors = {{1, 1, 1, 0}};
    auto area = createLight(p, shadows);
    auto &al = static_cast<SimpleAreaLight &>(*area);
    EXPECT_NE(al.attenuation(), nullptr);
    EXPECT_EQ(al.normal(), Vec3(0, 0, 1));

    p.type = LightType::kWindow;
    p.directionalLightShadowAngle = 0.5f;
    out = oxtest::captureOutput([&] {
        auto w = createLight(p, shadows);
        auto &wl = static_cast<SimpleWindowLight &>(*w);
        EXPECT_FLOAT_EQ(wl.halfAngle(), 0.25f * 3.14159265f / 180);  // half of 0.5 degrees
        EXPECT_TRUE(wl.shadowSampler().clipAtPlane);
        EXPECT_EQ(wl.photonEmission().power, Color());
    });
    EXPECT_NE(out.find("Photon emission from window lights not supported"), std::string::npos);

    p.type = LightType::kEnvironment;
    p.lowerColor = Color(0, 0, 1, 1);
    p.castShadows = true;
    auto env = createLight(p, shadows);
    EXPECT_TRUE(shadows);
    EXPECT_EQ(env->flags(), kLightAmbient | kLightShadows);
    auto &shader = static_cast<EnvironmentLight &>(*env).shader();
    EXPECT_EQ(shader.evaluateDirection({0, 1, 0}), p.color);
    EXPECT_EQ(shader.evaluateDirection({0, -1, 0}), p.lowerColor);

    p.type = static_cast<LightType>(9);
    out = oxtest::captureOutput([&] { EXPECT_EQ(createLight(p, shadows), nullptr); });
    EXPECT_NE(out.find("Unknown type 9 of light l"), std::string::npos);
}

TEST(Lights, ImageBasedLightParameters) {
    EXPECT_EQ(iblSubLightCount(300), 512u);
    EXPECT_EQ(iblSubLightCount(256), 256u);
    EXPECT_EQ(iblSubLightCount(0), 1u);
    EXPECT_EQ(iblSubLightCount(-5), 1u);
    EXPECT_EQ(iblSubLightCount(INT32_MAX), 65536u);  // capped
    EXPECT_EQ(iblScaledPhotonEnergy(10000), 1100000000);
    EXPECT_EQ(iblScaledPhotonEnergy(100000), INT32_MAX);  // saturates instead of wrapping
    EXPECT_EQ(iblScaledPhotonEnergy(-100000), INT32_MIN);

    EnvironmentValues v;
    v.iblImageFile = "/no/such/probe.hdr";
    std::string out = oxtest::captureOutput([&] {
        TextureFactory textures;
        EXPECT_EQ(createImageBasedLight(v, textures), nullptr);
    });
    EXPECT_NE(out.find("Error reading IBL lightprobe"), std::string::npos);
    KDHDRLight light(v);
    EXPECT_EQ(light.flags(), kLightDiffuse | kLightShadows);
    EXPECT_NEAR(light.intensity(), 6.2831853f, 1e-5f);
}

std::unique_ptr<Material> makeMaterial(const std::string &name, const PhongParameters &p = {}) {
    auto surface = std::make_unique<PhongShader>(name, p);
    auto photon = std::make_unique<PhongPhotonShader>(name + "_photon", p);
    return std::make_unique<Material>(std::move(surface), std::move(photon));
}

TEST(Materials, ConcurrentFindOrInsertMakesEachOnce) {
    MaterialTable table;
    std::atomic<int> made{0};
    std::vector<std::thread> threads;
    std::vector<const Material *> got(8);
    for (int t = 0; t < 8; ++t)
        threads.emplace_back([&, t] {
            for (int i = 0; i < 200; ++i) {
                std::string name = "m" + std::to_string(i % 20);
                const Material *m = table.findOrInsert(name, [&] {
                    ++made;
                    return makeMaterial(name);
                });
                if (i == 199) got[size_t(t)] = m;
            }
        });
    for (auto &t : threads) t.join();
    EXPECT_EQ(made.load(), 20);
    EXPECT_EQ(table.size(), 20u);
    for (const Material *m : got) EXPECT_EQ(m, got[0]);
    EXPECT_EQ(got[0]->name(), "m19");
    // The first registration of a name wins.
    const Material *first = table.find("m3");
    EXPECT_EQ(table.insert(makeMaterial("m3")), first);
    EXPECT_EQ(table.find("nope"), nullptr);
}

TEST(Materials, UvSetOverridesMakeVariantsPerShape) {
    PhongParameters p;
    p.channels[kPhongDiffuse].textureFile = "d.tga";
    p.channels[kPhongDiffuse].uvLayerOverride = "lightmap";
    PhongShader shader("m", p);
    EXPECT_TRUE(shader.hasUvOverrides());
    auto sets = shader.resolveUvSets({"map1", "lightmap"});
    EXPECT_EQ(sets[kPhongDiffuse], 1);
    EXPECT_EQ(sets[kPhongNormal], -1);
    EXPECT_EQ(shader.variantName(sets), "m|uv:1,-1,-1,-1,-1,-1,-1");
    EXPECT_EQ(shader.resolveUvSets({"map1"})[kPhongDiffuse], -1);
    PhongShaderUVOverride variant(shader.variantName(sets), shader, sets);
    EXPECT_EQ(variant.parameters().channels[kPhongDiffuse].uvSet, 1);
    EXPECT_EQ(variant.parameters().channels[kPhongDiffuse].textureFile, "d.tga");
}

}  // namespace
}  // namespace ox
