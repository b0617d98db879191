#include "bake/uv_mesh_search.h"

#include <gtest/gtest.h>

#include <cmath>

#include "bake/bake_sample.h"
#include "bake_test_util.h"

namespace ox {
namespace {

ResolvedBakeShape shapeOf(const Instance *instance) {
    ResolvedBakeShape s;
    s.instance = instance;
    s.uvSet = 0;
    return s;
}

TEST(UvMeshSearch, FindsTheTriangleAndItsBarycentrics) {
    Scene scene;
    // A 2 x 2 quad whose UVs fill the left half of the target.
    const Instance *quad =
        test::place(scene, test::makeQuad("q", -1, -1, 1, 1, {0, 0}, {0.5f, 1}), "quad");
    UvMeshSearch search;
    ASSERT_TRUE(search.build({shapeOf(quad)}, UvRect{}, 64, 32, 1));
    // Texel centres of the left half hit, the right half misses.
    for (int y = 0; y < 32; ++y)
        for (int x = 0; x < 64; ++x) {
            const UvHit hit = search.find(x + 0.5f, y + 0.5f);
            ASSERT_EQ(hit.found(), x < 32) << x << "," << y;
            if (!hit.found()) continue;
            BakeSurface s;
            fillBakeSurface(shapeOf(quad), hit.triangle, hit.b1, hit.b2, -1, s);
            EXPECT_NEAR(s.position.x, -1.0f + 2.0f * (x + 0.5f) / 32.0f, 1e-5f);
            EXPECT_NEAR(s.position.y, -1.0f + 2.0f * (y + 0.5f) / 32.0f, 1e-5f);
            EXPECT_EQ(s.normal, (Vec3{0, 0, 1}));
        }
    const UvCoverage c = search.coverage();
    EXPECT_EQ(c.covered, 32 * 32);
    EXPECT_EQ(c.overlapping, 0);  // the shared diagonal is no overlap
    EXPECT_FALSE(search.find(-0.5f, 3.0f).found());
    EXPECT_FALSE(search.find(NAN, 3.0f).found());
}

TEST(UvMeshSearch, OverlapsPreferTheWindingThenTheFirst) {
    // Three triangles over the same UV area: clockwise first, then two counter-clockwise.
    Scene scene;
    const Instance *inst = test::place(scene,
                                       test::makeShape("s",
                                                       {{{0, 0, 0}, {0, 0, 1}, {{0, 0}}},
                                                        {{1, 0, 0}, {0, 0, 1}, {{1, 0}}},
                                                        {{0, 1, 0}, {0, 0, 1}, {{0, 1}}}},
                                                       {{0, 2, 1}, {0, 1, 2}, {1, 2, 0}}, {"map"}),
                                       "s");
    for (int32_t winding : {0, 1}) {
        UvMeshSearch search;
        ASSERT_TRUE(search.build({shapeOf(inst)}, UvRect{}, 16, 16, winding));
        const UvHit hit = search.find(4.5f, 4.5f);
        ASSERT_TRUE(hit.found());
        EXPECT_EQ(hit.triangle, winding == 0 ? 0u : 1u);
        EXPECT_EQ(search.countContaining(4.5f, 4.5f), 3);
        const UvCoverage c = search.coverage();
        // Centres on the hypotenuse are covered but inside no triangle strictly.
        EXPECT_EQ(c.covered, 16 * 15 / 2 + 16);
        EXPECT_EQ(c.overlapping, 16 * 15 / 2);
    }
}

TEST(UvMeshSearch, ThinTrianglesAreFoundByTheirTexelSquare) {
    // A sliver 0.2 texels wide between two texel centres, and the UV matrix and range at work.
    Scene scene;
    const Instance *inst = test::place(scene,
                                       test::makeShape("thin",
                                                       {{{0, 0, 0}, {0, 0, 1}, {{0.6f, 0}}},
                                                        {{1, 0, 0}, {0, 0, 1}, {{0.8f, 0}}},
                                                        {{0, 1, 0}, {0, 0, 1}, {{0.7f, 10}}}},
                                                       {{0, 1, 2}}, {"map"}),
                                       "thin");
    ResolvedBakeShape s = shapeOf(inst);
    s.uvScale = {0.1f, 0.1f};  // u' = 0.06 .. 0.08 (texels 0.6 .. 0.8 below)
    UvMeshSearch search;
    ASSERT_TRUE(search.build({s}, UvRect{}, 10, 10, 1));
    EXPECT_FALSE(search.find(0.5f, 0.5f).found());
    const UvHit hit = search.findNear(0.5f, 0.5f, 0.5f, true);
    ASSERT_TRUE(hit.found());
    EXPECT_GE(hit.b1, 0.0f);
    EXPECT_GE(hit.b2, 0.0f);
    EXPECT_LE(hit.b1 + hit.b2, 1.0f + 1e-6f);
    EXPECT_FALSE(search.findNear(2.5f, 0.5f, 0.5f, true).found());

    // Specified range [0.05, 0.1] x [0, 1] spreads the sliver over 4 of 10 columns.
    UvMeshSearch wide;
    ASSERT_TRUE(wide.build({s}, UvRect{0.05f, 0.0f, 0.1f, 1.0f}, 10, 10, 1));
    EXPECT_TRUE(wide.find(2.5f, 0.5f).found());
    EXPECT_TRUE(wide.find(5.5f, 0.5f).found());
    EXPECT_FALSE(wide.find(6.5f, 0.5f).found());
}

TEST(UvMeshSearch, NearSearchExtrapolatesThroughTheEdge) {
    Scene scene;
    const Instance *quad =
        test::place(scene, test::makeQuad("q", 0, 0, 4, 4, {0.25f, 0.25f}, {0.75f, 0.75f}), "q");
    UvMeshSearch search;
    ASSERT_TRUE(search.build({shapeOf(quad)}, UvRect{}, 8, 8, 1));
    // Texel (1, 3) lies left of the chart (which spans texels 2..5): the plane continues.
    const UvHit hit = search.findNear(1.5f, 3.5f, 1.5f, false);
    ASSERT_TRUE(hit.found());
    BakeSurface s;
    fillBakeSurface(shapeOf(quad), hit.triangle, hit.b1, hit.b2, -1, s);
    EXPECT_NEAR(s.position.x, -0.5f, 1e-5f);
    EXPECT_NEAR(s.position.y, 1.5f, 1e-5f);
    EXPECT_FALSE(search.findNear(0.5f, 3.5f, 1.0f, false).found());
}

TEST(BakeSample, NormalDirectionAndViewDependence) {
    struct Case {
        int32_t direction;
        bool viewDependent;
        Vec3 eye;
        bool visible;
        float normalZ;
    };
    const Case cases[] = {
        {0, false, {0, 0, 5}, true, 1},  {0, false, {0, 0, -5}, true, 1},
        {0, true, {0, 0, -5}, false, 1}, {1, false, {0, 0, 5}, true, -1},
        {1, true, {0, 0, 5}, false, -1}, {1, true, {0, 0, -5}, true, -1},
        {2, false, {0, 0, 5}, true, 1},  {2, false, {0, 0, -5}, true, -1},
        {2, true, {0, 0, -5}, true, -1}, {0, true, {100, 0, 0.0f}, true, 1},
    };
    for (const Case &c : cases) {
        BakeSurface s;
        s.normal = s.geometricNormal = {0, 0, 1};
        s.tangent = {1, 0, 0};
        s.bitangent = {0, 1, 0};
        EXPECT_EQ(applyNormalDirection(s, c.direction, c.viewDependent, c.eye), c.visible)
            << c.direction << " " << c.eye.z;
        EXPECT_EQ(s.normal.z, c.normalZ);
        EXPECT_EQ(s.geometricNormal.z, c.normalZ);
        EXPECT_EQ(s.tangent.x, c.normalZ);
    }
}

TEST(BakeSample, EdgeBiasKeepsSamplesAwayFromEdges) {
    const Vec2 c[3] = {{0, 0}, {10, 0}, {0, 10}};
    // Distance to each edge in texels from barycentrics: edge 0-1 is y, edge 0-2 is x.
    struct Case {
        float b1, b2, bias;
        float minDistance;
    };
    const Case cases[] = {{0.0f, 0.0f, 1.0f, 1.0f},
                          {0.5f, 0.5f, 0.5f, 0.5f},
                          {0.2f, 0.3f, 0.0f, 0.0f},
                          {0.2f, 0.3f, 1.0f, 1.0f},
                          {0.0f, 0.0f, 100.0f, 2.35f}};  // the centroid
    for (const Case &k : cases) {
        float b1 = k.b1, b2 = k.b2;
        applyEdgeBias(c, k.bias, b1, b2);
        const float x = 10 * b1, y = 10 * b2;
        const float hyp = (10 - x - y) / std::sqrt(2.0f);
        EXPECT_GE(std::min({x, y, hyp}), k.minDistance - 1e-4f) << k.b1 << " " << k.bias;
        if (k.bias == 0.0f) {
            EXPECT_EQ(b1, k.b1);
        }
    }
}

}  // namespace
}  // namespace ox
