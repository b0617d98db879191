#include <gtest/gtest.h>

#include "raytrace/render_stats.h"
#include "scene/shading_setup.h"

namespace ox {
namespace {

std::unique_ptr<LightSource> light(const std::string &name) {
    LightParameters p;
    p.name = name;
    p.type = LightType::kDirectional;
    p.color = Color(1, 1, 1, 1);
    bool shadows = false;
    return createLight(p, shadows);
}

TEST(SceneShading, LightsLinksInstancesAndEnvironment) {
    // Three lights over 70 (so the link rows take two words) and three instances: "a" sees
    // only l1, "b" everything but l1, "c" everything.
    Scene scene;
    Shape shape("s");
    shape.computeBounds();
    for (const char *n : {"a", "b", "c"}) {
        const LinkMode mode = n[0] == 'a' ? LinkMode::kInclusive
                              : n[0] == 'b' ? LinkMode::kExclusive
                                            : LinkMode::kNone;
        std::vector<std::string> links;
        if (mode != LinkMode::kNone) links = {"l1"};
        ASSERT_TRUE(scene.addInstance(
            Instance::create(n, Mtx4(), &shape, nullptr, RenderStats::kDefault), mode, links));
    }
    for (int i = 0; i < 70; ++i)
        scene.addLight(light("l" + std::to_string(i)), LinkMode::kNone, {});
    scene.buildLightLinks();
    scene.setBias(0.01f);
    EnvironmentValues env;
    env.rtEnvironment = int32_t(EnvironmentKind::kSkyLight);
    std::string why;
    ASSERT_TRUE(scene.environment().create(env, why));

    ShadingSettings settings;
    settings.reflectionDepth = 3;
    SceneShading shading(scene, nullptr, settings, 2, 9);
    const ShadingScene &s = shading.scene();
    ASSERT_EQ(s.lightCount, 70u);
    EXPECT_EQ(s.lights[5], scene.lights()[5].get());
    ASSERT_EQ(s.instanceCount, 3u);
    EXPECT_EQ(s.instances[2], scene.instances()[2].get());
    for (uint32_t i = 0; i < 3; ++i)
        for (uint32_t l = 0; l < 70; ++l)
            EXPECT_EQ(s.reaches(i, l), scene.lightReaches(i, l)) << i << " " << l;
    EXPECT_FALSE(s.reaches(0, 69));
    EXPECT_TRUE(s.reaches(0, 1));
    EXPECT_FALSE(s.reaches(1, 1));
    EXPECT_EQ(s.shadowTracer.bias, 0.01f);
    EXPECT_EQ(s.shadowTracer.minShadowRays, 2u);
    EXPECT_EQ(s.shadowTracer.maxShadowRays, 9u);
    EXPECT_EQ(s.settings.reflectionDepth, 3u);
    EXPECT_EQ(s.rtEnvironment, scene.environment().rtShader());
    EXPECT_NE(s.rtEnvironment, nullptr);
    EXPECT_EQ(s.giEnvironment, nullptr);
}

}  // namespace
}  // namespace ox
