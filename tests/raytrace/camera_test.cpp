#include "raytrace/camera.h"

#include <gtest/gtest.h>

#include <cmath>

namespace ox {
namespace {

constexpr float kPi = 3.14159265358979f;

void expectNear(const Vec3 &a, const Vec3 &b, float eps = 1e-5f) {
    EXPECT_NEAR(a.x, b.x, eps);
    EXPECT_NEAR(a.y, b.y, eps);
    EXPECT_NEAR(a.z, b.z, eps);
}

TEST(CameraTest, PerspectiveCentreShiftAndDifferentials) {
    PerspectiveCamera cam("cam", Mtx4(), nullptr, kPi / 3, kPi / 3, {0, 0});
    Ray r;
    cam.generateRay({0.5f, 0.5f}, {0.5f, 0.5f}, r);
    expectNear(r.direction, {0, 0, -1});
    expectNear(r.origin, {0, 0, 0});
    EXPECT_EQ(r.type, kRayPrimary);
    // At the centre the direction changes by H per unit x (|d| = 1).
    expectNear(r.dDdx, {2.0f * std::tan(kPi / 6), 0, 0});
    expectNear(r.dDdy, {0, 2.0f * std::tan(kPi / 6), 0});
    expectNear(r.dOdx, {0, 0, 0});
    // The right edge of the image is fovX/2 off the axis.
    cam.generateRay({1.0f, 0.5f}, {0.5f, 0.5f}, r);
    EXPECT_NEAR(std::atan2(r.direction.x, -r.direction.z), kPi / 6, 1e-5f);
    // Differentials agree with finite differences of the direction.
    Ray a, b;
    cam.generateRay({0.3f, 0.7f}, {0, 0}, a);
    cam.generateRay({0.3001f, 0.7f}, {0, 0}, b);
    expectNear((b.direction - a.direction) * 10000.0f, a.dDdx, 2e-3f);

    // A shift of (0.5, 0) moves the centre by half of the right vector, whatever the fov.
    for (float fov : {0.3f, 1.0f, 2.0f}) {
        PerspectiveCamera shifted("s", Mtx4(), nullptr, fov, fov, {0.5f, 0});
        shifted.generateRay({0.5f, 0.5f}, {0, 0}, r);
        expectNear(r.direction, Vec3(0.5f, 0, -1).normalized());
    }
    // The placement: position from the last row, the view along -W.
    Mtx4 m;
    m.m[2][0] = 0, m.m[2][2] = -1;  // W = -z: looks along +z
    m.m[0][0] = -1;
    m.m[3][0] = 1, m.m[3][1] = 2, m.m[3][2] = 3;
    PerspectiveCamera placed("p", m, nullptr, 1, 1, {0, 0});
    placed.generateRay({0.5f, 0.5f}, {0.2f, 0.9f}, r);
    expectNear(r.direction, {0, 0, 1});
    expectNear(r.origin, {1, 2, 3});
    EXPECT_EQ(placed.position(), Vec3(1, 2, 3));
    EXPECT_EQ(placed.name(), "p");
    EXPECT_FLOAT_EQ(placed.fovX(), 1.0f);
}

TEST(CameraTest, LensIsUsedOnlyWhenSwitchedOnWithPositiveParameters) {
    EXPECT_FALSE(PerspectiveCamera("a", Mtx4(), nullptr, 1, 1, {0, 0}).usesLens());
    EXPECT_FALSE(
        PerspectiveCamera("b", Mtx4(), nullptr, 1, 1, {0, 0}, 0, 1, 0.0f, 5.0f).usesLens());
    EXPECT_FALSE(
        PerspectiveCamera("c", Mtx4(), nullptr, 1, 1, {0, 0}, 0, 1, 2.0f, -1.0f).usesLens());
    EXPECT_FALSE(
        PerspectiveCamera("d", Mtx4(), nullptr, 1, 1, {0, 0}, 0, 0, 2.0f, 5.0f).usesLens());
    PerspectiveCamera lens("e", Mtx4(), nullptr, 1, 1, {0, 0}, 3, 1, 2.0f, 5.0f);
    ASSERT_TRUE(lens.usesLens());
    EXPECT_FLOAT_EQ(lens.lensFactor(), 5.0f * 0.5f / 2.0f);
    EXPECT_EQ(lens.lensA(), 3);
    // Every lens point's ray passes through the same focal point on the pinhole ray.
    Ray pin, r;
    PerspectiveCamera("f", Mtx4(), nullptr, 1, 1, {0, 0}).generateRay({0.7f, 0.4f}, {0, 0}, pin);
    Vec3 focus = pin.direction * (5.0f / dot(pin.direction, Vec3(0, 0, -1)));
    for (Vec2 l : {Vec2(0.1f, 0.9f), Vec2(0.8f, 0.2f), Vec2(0.5f, 0.5f), Vec2(0, 0)}) {
        lens.generateRay({0.7f, 0.4f}, l, r);
        Vec3 toFocus = focus - r.origin;
        float along = dot(toFocus, r.direction);
        expectNear(r.origin + r.direction * along, focus, 1e-4f);
        EXPECT_LE(std::fabs(r.origin.z), 1e-6f);
    }
    // The centre of the lens square maps to the centre of the disk.
    lens.generateRay({0.7f, 0.4f}, {0.5f, 0.5f}, r);
    expectNear(r.origin, {0, 0, 0});
    // Base-class values.
    OrthoCamera o("o", Mtx4(), nullptr, {10, 10});
    const Camera &base = o;
    EXPECT_EQ(base.lensSwitch(), 0);
    EXPECT_FLOAT_EQ(base.lensRatio(), 1.0f);
    EXPECT_FLOAT_EQ(base.focusDistance(), 1.0f);
    EXPECT_FLOAT_EQ(base.fovY(), 1.0f);
}

TEST(CameraTest, OrthographicRaysAreParallel) {
    OrthoCamera cam("o", Mtx4(), nullptr, {10, 10});
    Ray r;
    cam.generateRay({0, 0}, {0, 0}, r);
    expectNear(r.origin, {-5, -5, 0});
    expectNear(r.direction, {0, 0, -1});
    cam.generateRay({1, 1}, {0, 0}, r);
    expectNear(r.origin, {5, 5, 0});
    expectNear(r.direction, {0, 0, -1});
    expectNear(r.dOdx, {10, 0, 0});
    expectNear(r.dOdy, {0, 10, 0});
    expectNear(r.dDdx, {0, 0, 0});
}

TEST(CameraTest, EnvironmentProjectionsAndUncoveredPoints) {
    EnvCamera::Projection p;
    EXPECT_FALSE(EnvCamera::projectionFromIndex(3, p));
    ASSERT_TRUE(EnvCamera::projectionFromIndex(0, p));
    EnvCamera cube("c", Mtx4::translation({1, 2, 3}), nullptr, EnvCamera::kCubeMap);
    Ray r;
    // Uncovered: left column in the top row (t = 1 - y).
    cube.generateRay({0.1f, 0.05f}, {0, 0}, r);
    EXPECT_EQ(r.type, kRayEnvironment);
    expectNear(r.direction, {0, 1, 0});
    expectNear(r.origin, {1, 2, 3});
    expectNear(r.dDdx, {0, 0, 0});
    int uncovered = 0;
    for (int j = 0; j < 4; ++j)
        for (int i = 0; i < 3; ++i) {
            cube.generateRay({(i + 0.5f) / 3.0f, 1.0f - (j + 0.5f) / 4.0f}, {0, 0}, r);
            uncovered += r.type == kRayEnvironment;
        }
    EXPECT_EQ(uncovered, 6);
    // The centre of the cross looks along +z; the top cell along +y.
    cube.generateRay({0.5f, 1.0f - 1.5f / 4.0f}, {0, 0}, r);
    EXPECT_EQ(r.type, kRayPrimary);
    expectNear(r.direction, {0, 0, 1});
    EXPECT_GT(r.dDdx.length(), 0.0f);
    cube.generateRay({0.5f, 1.0f - 0.5f / 4.0f}, {0, 0}, r);
    expectNear(r.direction, {0, 1, 0});
    // The far edge belongs to the last row and column.
    cube.generateRay({0.5f, 0.0f}, {0, 0}, r);
    EXPECT_EQ(r.type, kRayPrimary);

    EnvCamera ball("b", Mtx4(), nullptr, EnvCamera::kBall);
    ball.generateRay({0.02f, 0.02f}, {0, 0}, r);
    EXPECT_EQ(r.type, kRayEnvironment);
    ball.generateRay({0.5f, 0.5f}, {0, 0}, r);
    EXPECT_EQ(r.type, kRayPrimary);
    expectNear(r.direction, {0, 0, 1});  // the ball reflects straight back
    ball.generateRay({0.5f + 0.5f * std::sqrt(0.5f) - 1e-4f, 0.5f}, {0, 0}, r);
    EXPECT_NEAR(r.direction.z, 0.0f, 2e-3f);  // 45 degrees on the ball: sideways

    EnvCamera lat("l", Mtx4(), nullptr, EnvCamera::kLatLong);
    lat.generateRay({0.25f, 0.5f}, {0, 0}, r);
    EXPECT_EQ(r.type, kRayPrimary);
    expectNear(r.origin, {1e-5f, 0, 0});
    expectNear(r.direction, {-1, 0, 0});
    lat.generateRay({0.5f, 0.5f}, {0, 0}, r);
    expectNear(r.direction, {0, 0, 1});
    lat.generateRay({0.3f, 1.0f}, {0, 0}, r);
    expectNear(r.direction, {0, 1, 0});
    // Rotation has no effect on a panorama.
    Mtx4 rot;
    rot.m[0][0] = 0, rot.m[0][1] = 1, rot.m[1][0] = -1, rot.m[1][1] = 0;
    rot.m[3][1] = 5;
    EnvCamera turned("t", rot, nullptr, EnvCamera::kLatLong);
    turned.generateRay({0.25f, 0.5f}, {0, 0}, r);
    expectNear(r.direction, {-1, 0, 0});
    expectNear(r.origin, {0, 5, 0});
}

TEST(RayTest, TypeNamesAndRequiredFlags) {
    EXPECT_STREQ(rayTypeName(0), "Primary");
    EXPECT_STREQ(rayTypeName(5), "Final Gather");
    EXPECT_STREQ(rayTypeName(10), "Image Plane");
    EXPECT_STREQ(rayTypeName(11), "Unknown");
    EXPECT_STREQ(rayTypeName(-1), "Unknown");
    EXPECT_EQ(rayTypeRequiredFlags(kRayPhoton), 0xC00u);
    EXPECT_EQ(rayTypeRequiredFlags(kRayEnvironment), 0u);
    EXPECT_EQ(rayTypeRequiredFlags(42), 0u);
    RayCounter c, d;
    c.add(3), c.add(3), c.add(99);
    d.add(3);
    c.merge(d);
    EXPECT_EQ(c.count(3), 3u);
    EXPECT_EQ(c.count(-7), 1u);
    EXPECT_EQ(c.total(), 4u);
}

}  // namespace
}  // namespace ox
