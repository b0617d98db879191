#include "bake/bake_target.h"

#include <gtest/gtest.h>

#include <cmath>
#include <functional>

#include "bake_test_util.h"
#include "core/message.h"
#include "tests/support/test_support.h"

namespace ox {
namespace {

TEST(BakePassList, FollowsTheBakeOrderWithBeautyLast) {
    OXCComplexTypeInstantiator<RenderComponentsBase> c;
    EXPECT_TRUE(bakePassList(c).empty());
    c.fullShading = true;
    EXPECT_EQ(bakePassList(c), (std::vector<std::string>{"beauty"}));
    c.illumination = true;
    EXPECT_EQ(bakePassList(c), (std::vector<std::string>{"tpIllumination", "beauty"}));
    c.normals = true;
    c.albedo = true;
    c.rnm = true;
    c.fullAndIndirectIllumination = true;
    c.customPasses.push("ambientOcclusion");
    c.lightPass.append();
    EXPECT_EQ(bakePassList(c),
              (std::vector<std::string>{"tpIllumination", "tpAlbedo", "tpRnm",
                                        "tpFullandIndirectIllumination", "tpNormals",
                                        "ambientOcclusion", "tpLightPass0", "beauty"}));
}

TEST(BakeTargetValidation, RejectsBadSizesAndSharedNames) {
    struct Case {
        Vec2i size;
        float scale;
        bool ok;
    };
    const Case cases[] = {
        {{512, 512}, 1.0f, true}, {{0, 512}, 1.0f, false},    {{512, -3}, 1.0f, false},
        {{65535, 1}, 1.0f, true}, {{65536, 16}, 1.0f, false}, {{2, 2}, 0.4f, false},
        {{64, 64}, 1e30f, false}, {{64, 64}, NAN, false},     {{100, 100}, 0.5f, true},
    };
    for (const Case &c : cases) {
        OXCComplexTypeInstantiator<TextureBakeSettingsBase> s;
        s.resolutionScale = c.scale;
        BakeTextureTargetBase &t = s.targets.append();
        t.textureName = "wall";
        t.hasResolutionOverride = true;
        t.resolutionOverride = c.size;
        bool ok = false;
        const std::string out = oxtest::captureOutput([&] {
            ok = validateBakeTargets(s, {640, 480});
        });
        EXPECT_EQ(ok, c.ok) << c.size.x << "x" << c.size.y << " * " << c.scale;
        EXPECT_EQ(out.find("BakeTextureTarget 'wall' with invalid dimension") != std::string::npos,
                  !c.ok);
    }
    // Without the override the frame resolution counts.
    OXCComplexTypeInstantiator<TextureBakeSettingsBase> s;
    s.targets.append();
    s.targets.append().textureName = "other";
    EXPECT_FALSE(validateBakeTargets(s, {0, 480}));
    EXPECT_TRUE(validateBakeTargets(s, {640, 480}));
    // Two targets named alike would write the same files.
    s.targets.append();
    bool ok = true;
    const std::string out = oxtest::captureOutput([&] { ok = validateBakeTargets(s, {640, 480}); });
    EXPECT_FALSE(ok);
    EXPECT_NE(out.find("BakeTextureTarget 1 and 3 are both named 'default'"), std::string::npos);
}

TEST(BakeShapes, ResolveUvSetsAndSkipBadShapes) {
    Scene scene;
    test::place(scene,
                test::makeShape("two",
                                {{{0, 0, 0}, {0, 0, 1}, {{0, 0}, {0.5f, 0.5f}}},
                                 {{1, 0, 0}, {0, 0, 1}, {{1, 0}, {1, 0.5f}}},
                                 {{0, 1, 0}, {0, 0, 1}, {{0, 1}, {0.5f, 1}}}},
                                {{0, 1, 2}}, {"map1", "second"}),
                "a");
    test::place(
        scene,
        test::makeShape(
            "three",
            {{{0, 0, 0}, {0, 0, 1}, {}}, {{1, 0, 0}, {0, 0, 1}, {}}, {{0, 1, 0}, {0, 0, 1}, {}}},
            {{0, 1, 2}}, {"uv", "LightMap", "x"}),
        "b");
    EXPECT_EQ(defaultLightMapUvSet(scene.findInstance("a")->shape().vertices()), 1);
    EXPECT_EQ(defaultLightMapUvSet(scene.findInstance("b")->shape().vertices()), 1);

    OXCComplexTypeInstantiator<TextureBakeSettingsBase> s;
    BakeTextureTargetBase &t = s.targets.append();
    t.textureName = "atlas";
    auto add = [&](const char *target) -> BakeShapeBase & {
        BakeShapeBase &b = t.targetSurfaces.append();
        b.target = target;
        return b;
    };
    add("a").UVScale = Vec2{0.5f, 2.0f};
    add("missing");
    add("b").UVScale = Vec2{0.0f, 1.0f};
    BakeShapeBase &over = add("b");
    over.hasUVSetOverride = true;
    over.UVSetOverride = "x";
    over.name = "bee";
    BakeShapeBase &unknown = add("a");
    unknown.hasUVSetOverride = true;
    unknown.UVSetOverride = "nope";

    std::vector<ResolvedBakeShape> shapes;
    const std::string out = oxtest::captureOutput([&] { shapes = resolveBakeShapes(s, t, scene); });
    EXPECT_NE(out.find("Instance missing not found, make sure it exists in the scene"),
              std::string::npos);
    EXPECT_NE(out.find("Target atlas with instance b has a non-invertible UV-matrix!"),
              std::string::npos);
    EXPECT_NE(out.find("has no UV set 'nope'"), std::string::npos);
    ASSERT_EQ(shapes.size(), 2u);
    EXPECT_EQ(shapes[0].instance, scene.findInstance("a"));
    EXPECT_EQ(shapes[0].instanceIndex, 0u);
    EXPECT_EQ(shapes[0].uvSet, 1);
    EXPECT_EQ(shapes[0].uvScale, (Vec2{0.5f, 2.0f}));
    EXPECT_EQ(shapes[0].name, "a");
    EXPECT_EQ(shapes[1].instanceIndex, 1u);
    EXPECT_EQ(shapes[1].uvSet, 2);
    EXPECT_EQ(shapes[1].name, "bee");

    // The settings' UV set applies where no override names one.
    s.uvSet = "map1";
    t.targetSurfaces.clear();
    add("a");
    shapes = resolveBakeShapes(s, t, scene);
    ASSERT_EQ(shapes.size(), 1u);
    EXPECT_EQ(shapes[0].uvSet, 0);

    // UV ranges: Default is the unit square, Entire the shapes' box, Specified as given.
    auto rect = bakeUvRect(s, shapes, "atlas");
    ASSERT_TRUE(rect);
    EXPECT_EQ(rect->uMax, 1.0f);
    s.uvRange = UVRangeType::Entire;
    shapes[0].uvScale = {2.0f, 1.0f};
    shapes[0].uvBias = {1.0f, 0.0f};
    rect = bakeUvRect(s, shapes, "atlas");
    ASSERT_TRUE(rect);
    EXPECT_FLOAT_EQ(rect->uMin, 1.0f);
    EXPECT_FLOAT_EQ(rect->uMax, 3.0f);
    s.uvRange = UVRangeType::Specified;
    s.uMin = 0.25f, s.uMax = 0.75f, s.vMin = 0.5f, s.vMax = 0.5f;
    EXPECT_FALSE(bakeUvRect(s, shapes, "atlas"));
}

}  // namespace
}  // namespace ox
