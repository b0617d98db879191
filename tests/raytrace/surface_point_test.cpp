#include "raytrace/surface_point.h"

#include <gtest/gtest.h>

#include <cmath>
#include <memory>

#include "raytrace/complete_grid.h"
#include "raytrace/instance.h"
#include "raytrace/motion_blur.h"
#include "raytrace/shape.h"

namespace ox {
namespace {

void expectNear(const Vec3 &got, const Vec3 &want, const char *what) {
    EXPECT_NEAR(got.x, want.x, 1e-5f) << what;
    EXPECT_NEAR(got.y, want.y, 1e-5f) << what;
    EXPECT_NEAR(got.z, want.z, 1e-5f) << what;
}

void expectNear(const Vec2 &got, const Vec2 &want, const char *what) {
    EXPECT_NEAR(got.x, want.x, 1e-5f) << what;
    EXPECT_NEAR(got.y, want.y, 1e-5f) << what;
}

// A unit square in z = 0 as two triangles: 0 = (1, 3, 2) in material slot 0, 1 = (0, 1, 2) in
// slot 1. Vertex normals lean along +x at vertex 1; two UV sets, set 1 without tangents;
// red, green and blue at vertices 0 to 2.
std::unique_ptr<Shape> square() {
    auto s = std::make_unique<Shape>("square");
    VertexList &v = s->vertices();
    v.resize(4, 2, true);
    const Vec3 pos[4] = {{0, 0, 0}, {1, 0, 0}, {0, 1, 0}, {1, 1, 0}};
    const Vec2 uv0[4] = {{0, 0}, {1, 0}, {0, 1}, {1, 1}}, uv1[4] = {{1, 1}, {1, 3}, {5, 1}, {5, 3}};
    const Color col[4] = {{1, 0, 0, 1}, {0, 1, 0, 1}, {0, 0, 1, 1}, {1, 1, 1, 1}};
    for (uint32_t i = 0; i < 4; ++i) {
        v.setPosition(i, pos[i]);
        v.normal(i) = i == 1 ? Vec3(1, 0, 1) : Vec3(0, 0, 1);
        v.color(i) = col[i];
        v.uvData(0)[i] = uv0[i], v.uvData(1)[i] = uv1[i];
        v.tangentData(0)[i] = {1, 0, 0}, v.bitangentData(0)[i] = {0, 1, 0};
    }
    s->triangles() = {{{1, 3, 2}, 0}, {{0, 1, 2}, 1}};
    s->materials() = {reinterpret_cast<const MaterialHandle *>(0x10),
                      reinterpret_cast<const MaterialHandle *>(0x20)};
    s->computeBounds();
    return s;
}

// Mirrored in x, scaled by 2 and moved by (5, 1, 0): object (x, y, z) lands at
// (5 - 2x, 1 + 2y, 2z), so triangle 1 has world corners (5, 1, 0), (3, 1, 0), (5, 3, 0).
const Mtx4 kPlacement = Mtx4::scale({-2.0f, 2.0f, 2.0f}) * Mtx4::translation({5.0f, 1.0f, 0.0f});

TEST(SurfacePointTest, MirroredScaledInstanceMatchesHandComputedValues) {
    auto shape = square();
    auto inst = Instance::create("mirror", kPlacement, shape.get(), nullptr, RenderStats::kDefault);
    ASSERT_TRUE(inst);
    // Down onto object point (0.25, 0.25), world (4.5, 1.5, 0), from 3 above. One image unit
    // turns the direction by 0.01 along x (and y), and moves the origin 0.5 along z in y: the
    // differential ray is carried back onto the plane.
    Ray ray;
    ray.origin = {4.5f, 1.5f, 3.0f};
    ray.direction = {0, 0, -1};
    ray.dDdx = {0.01f, 0, 0};
    ray.dDdy = {0, 0.01f, 0};
    ray.dOdy = {0, 0, 0.5f};
    for (int mode : {kInstancingNever, kInstancingAlways}) {
        SCOPED_TRACE(mode);
        CompleteGrid grid;
        ADSParameters params;
        params.useInstancing = mode;
        ASSERT_TRUE(grid.build({instanceInput(*inst, 7)}, params));
        Hit hit;
        ASSERT_TRUE(grid.intersect(ray, hit, nullptr));
        SurfacePoint p;
        ASSERT_TRUE(surfacePoint(ray, hit, *inst, p));

        expectNear(p.position, {4.5f, 1.5f, 0.0f}, "position");
        EXPECT_NEAR(p.u, 0.25f, 1e-6f);
        EXPECT_NEAR(p.v, 0.25f, 1e-6f);
        // The world winding (0, 0, -4) is turned back by the mirror: the object's front.
        expectNear(p.geometricNormal, {0, 0, 1}, "geometric normal");
        EXPECT_FALSE(p.backSide);
        // Object normal 0.5 (0,0,1) + 0.25 (1,0,1) + 0.25 (0,0,1) = (0.25, 0, 1), times the
        // inverse transpose diag(-0.5, 0.5, 0.5): along (-1, 0, 4).
        const float r17 = 1.0f / std::sqrt(17.0f);
        expectNear(p.normal, Vec3(-1, 0, 4) * r17, "shading normal");
        // Tangent (1, 0, 0) lands on (-1, 0, 0); made orthogonal to the normal: (-4, 0, -1).
        // The bitangent keeps its set's +y: a left-handed frame, as a mirror gives.
        expectNear(p.tangent, Vec3(-4, 0, -1) * r17, "tangent");
        expectNear(p.bitangent, {0, 1, 0}, "bitangent");

        expectNear(p.dPdx, {0.03f, 0, 0}, "dPdx");
        expectNear(p.dPdy, {0, 0.03f, 0}, "dPdy");
        // World edges (-2, 0, 0) and (0, 2, 0).
        EXPECT_NEAR(p.dudx, -0.015f, 1e-6f);
        EXPECT_NEAR(p.dvdx, 0.0f, 1e-6f);
        EXPECT_NEAR(p.dudy, 0.0f, 1e-6f);
        EXPECT_NEAR(p.dvdy, 0.015f, 1e-6f);

        ASSERT_EQ(p.uvSetCount, 2u);
        expectNear(p.uvs[0].uv, {0.25f, 0.25f}, "uv 0");
        expectNear(p.uvs[0].dUVdx, {-0.015f, 0}, "dUVdx 0");
        expectNear(p.uvs[0].dUVdy, {0, 0.015f}, "dUVdy 0");
        expectNear(p.uvs[0].tangent, {-1, 0, 0}, "tangent 0");
        expectNear(p.uvs[0].bitangent, {0, 1, 0}, "bitangent 0");
        // Set 1: (1, 1) + 0.25 (0, 2) + 0.25 (4, 0).
        expectNear(p.uvs[1].uv, {2.0f, 1.5f}, "uv 1");
        expectNear(p.uvs[1].dUVdx, {0, -0.03f}, "dUVdx 1");
        expectNear(p.uvs[1].dUVdy, {0.06f, 0}, "dUVdy 1");
        EXPECT_EQ(p.uvs[1].tangent, Vec3());
        EXPECT_EQ(surfaceUv(p, 1).uv, p.uvs[1].uv);
        EXPECT_EQ(surfaceUv(p, 2).uv, Vec2());  // no such set

        EXPECT_NEAR(p.color.r, 0.5f, 1e-6f);
        EXPECT_NEAR(p.color.g, 0.25f, 1e-6f);
        EXPECT_NEAR(p.color.b, 0.25f, 1e-6f);
        EXPECT_NEAR(p.color.a, 1.0f, 1e-6f);
        EXPECT_EQ(p.material, reinterpret_cast<const MaterialHandle *>(0x20));
        EXPECT_EQ(p.instance, inst.get());
        EXPECT_EQ(p.instanceIndex, 7u);
        EXPECT_EQ(p.flags, RenderStats::kDefault);
        EXPECT_EQ(p.triangle, 1u);
        EXPECT_EQ(p.corners[0], 0u);
        EXPECT_EQ(p.corners[2], 2u);
        EXPECT_FALSE(p.moving);

        // From below (the instance is double-sided): the back, with the same normals.
        Ray up = ray;
        up.origin.z = -3.0f;
        up.direction = {0, 0, 1};
        ASSERT_TRUE(grid.intersect(up, hit, nullptr));
        ASSERT_TRUE(surfacePoint(up, hit, *inst, p));
        EXPECT_TRUE(p.backSide);
        expectNear(p.geometricNormal, {0, 0, 1}, "geometric normal from below");
    }
}

TEST(SurfacePointTest, FlatShadingOverrideMovingTrianglesAndBadHits) {
    auto shape = square();
    auto override = reinterpret_cast<const MaterialHandle *>(0x30);
    auto inst = Instance::create("flat", kPlacement, shape.get(), override,
                                 RenderStats::kDefault & ~kFlagSmoothShading);
    ASSERT_TRUE(inst);
    // Without smooth shading the shading normal is the geometric one; no colours or UV sets:
    // zero colour and any frame around the normal.
    shape->vertices().resize(4, 0, false);
    shape->vertices().setPosition(0, {0, 0, 0});
    shape->vertices().setPosition(1, {1, 0, 0});
    shape->vertices().setPosition(2, {0, 1, 0});
    shape->vertices().setPosition(3, {1, 1, 0});
    Ray ray;
    ray.origin = {4.5f, 1.5f, 3.0f};
    ray.direction = {0, 0, -1};
    Hit hit;
    hit.t = 3.0f, hit.u = 0.25f, hit.v = 0.25f, hit.id = 1, hit.instance = 0;
    SurfacePoint p;
    ASSERT_TRUE(surfacePoint(ray, hit, *inst, p));
    expectNear(p.normal, {0, 0, 1}, "flat normal");
    EXPECT_EQ(p.material, override);
    EXPECT_EQ(p.color, Color());
    EXPECT_EQ(p.uvSetCount, 0u);
    EXPECT_NEAR(dot(p.tangent, p.normal), 0.0f, 1e-6f);
    EXPECT_NEAR(p.tangent.length(), 1.0f, 1e-6f);
    expectNear(cross(p.normal, p.tangent), p.bitangent, "frame");
    EXPECT_EQ(p.dPdx, Vec3());  // no differentials

    // Hits that name nothing the instance has leave the point alone.
    Hit outOfRange = hit, movingWithoutGrid = hit;
    outOfRange.id = 2;
    movingWithoutGrid.moving = true;
    for (const Hit &bad : {Hit(), outOfRange, movingWithoutGrid}) {
        p.triangle = 99;
        EXPECT_FALSE(surfacePoint(ray, bad, *inst, p));
        EXPECT_EQ(p.triangle, 99u);
    }

    // A moving copy one unit up at time 1: at time 0.5 the point lies half way.
    InstanceInput in = instanceInput(*inst, 0);
    in.stepTransforms = {kPlacement, kPlacement * Mtx4::translation({0, 0, 1})};
    MotionBlurHandler motion(MotionBlurHandler::k3D, 1);
    CompleteGrid grid;
    ASSERT_TRUE(grid.build({in}, ADSParameters(), &motion));
    ray.time = 0.5f;
    ASSERT_TRUE(grid.intersect(ray, hit, nullptr));
    ASSERT_TRUE(hit.moving);
    ASSERT_TRUE(surfacePoint(ray, hit, *inst, p, &grid));
    EXPECT_TRUE(p.moving);
    expectNear(p.position, {4.5f, 1.5f, 0.5f}, "moving position");
    expectNear(p.geometricNormal, {0, 0, 1}, "moving normal");
}

}  // namespace
}  // namespace ox
