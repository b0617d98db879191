#include "raytrace/camera.h"

#include <algorithm>
#include <cmath>
#include <numbers>
#include <utility>

namespace ox {

namespace {

Vec3 row(const Mtx4 &m, int i) { return {m.m[i][0], m.m[i][1], m.m[i][2]}; }

constexpr float kPi = std::numbers::pi_v<float>;

// Concentric mapping of the unit square onto the unit disk (radius and angle).
void squareToDisk(float u, float v, float &r, float &phi) {
    float a = 2.0f * u - 1.0f, b = 2.0f * v - 1.0f;
    if (a > -b) {
        if (a > b) {
            r = a;
            phi = (kPi / 4.0f) * (b / a);
        } else {
            r = b;
            phi = (kPi / 4.0f) * (2.0f - a / b);
        }
    } else {
        if (a < b) {
            r = -a;
            phi = (kPi / 4.0f) * (4.0f + b / a);
        } else {
            r = -b;
            phi = b != 0.0f ? (kPi / 4.0f) * (6.0f - a / b) : 0.0f;
        }
    }
}

}  // namespace

Camera::Camera(std::string name, const Mtx4 &objectToWorld, const EnvironmentHandle *env)
    : name_(std::move(name)),
      objectToWorld_(objectToWorld),
      environment_(env),
      right_(row(objectToWorld, 0)),
      up_(row(objectToWorld, 1)),
      back_(row(objectToWorld, 2)),
      pos_(row(objectToWorld, 3)) {}

Camera::~Camera() = default;

PerspectiveCamera::PerspectiveCamera(std::string name, const Mtx4 &objectToWorld,
                                     const EnvironmentHandle *env, float fovX, float fovY,
                                     const Vec2 &shift, int lensA, int lensSwitch, float lensRatio,
                                     float focusDistance)
    : Camera(std::move(name), objectToWorld, env),
      fovX_(fovX),
      fovY_(fovY),
      shift_(shift),
      lensA_(lensA),
      lensSwitch_(lensSwitch),
      lensRatio_(lensRatio),
      focus_(focusDistance) {
    h_ = right_ * (2.0f * std::tan(fovX * 0.5f));
    v_ = up_ * (2.0f * std::tan(fovY * 0.5f));
    c_ = right_ * shift.x + up_ * shift.y - back_;
    cUnit_ = c_.normalized();
    float m = std::fmax(fovX, fovY);
    float lens = 2.0f * std::tan(m * 0.5f);
    l1_ = right_ * lens;
    l2_ = up_ * lens;
    // The lens radius is only meaningful with the lens on and a positive ratio and focus; any
    // other combination (the scene's cameras pass zeros) keeps the pinhole.
    if (lensSwitch != 0 && lensRatio > 0.0f && focusDistance > 0.0f && std::isfinite(lensRatio) &&
        std::isfinite(focusDistance)) {
        float a = focusDistance * 0.5f / lensRatio;
        if (std::isfinite(a) && a > 0.0f) lensFactor_ = a;
    }
}

void PerspectiveCamera::generateRay(const Vec2 &image, const Vec2 &lens, Ray &ray) const {
    Vec3 d = h_ * (image.x - 0.5f) + v_ * (image.y - 0.5f) + c_;
    float n = d.lengthSquared();
    Vec3 dir = d.normalized();
    ray.type = kRayPrimary;
    ray.dOdx = ray.dOdy = Vec3();
    float n15 = n * std::sqrt(n);
    if (n15 > 0.0f) {
        ray.dDdx = (h_ * n - d * dot(h_, d)) / n15;
        ray.dDdy = (v_ * n - d * dot(v_, d)) / n15;
    } else {
        ray.dDdx = ray.dDdy = Vec3();
    }
    float along = dot(dir, cUnit_);
    // Without a lens, or for a direction that never meets the focal plane, the pinhole ray.
    if (lensFactor_ <= 0.0f || !(along > 0.0f)) {
        ray.origin = pos_;
        ray.direction = dir;
        return;
    }
    float r, phi;
    squareToDisk(lens.x, lens.y, r, phi);
    Vec3 o = pos_ + (l1_ * std::cos(phi) + l2_ * std::sin(phi)) * (lensFactor_ * r);
    Vec3 f = pos_ + dir * (focus_ / along);
    ray.origin = o;
    ray.direction = (f - o).normalized();
}

OrthoCamera::OrthoCamera(std::string name, const Mtx4 &objectToWorld,
                         const EnvironmentHandle *env, const Vec2 &imagePlaneSize)
    : Camera(std::move(name), objectToWorld, env) {
    h_ = right_ * imagePlaneSize.x;
    v_ = up_ * imagePlaneSize.y;
    d_ = (-back_).normalized();
}

void OrthoCamera::generateRay(const Vec2 &image, const Vec2 &lens, Ray &ray) const {
    ray.type = kRayPrimary;
    ray.origin = pos_ + h_ * (image.x - 0.5f) + v_ * (image.y - 0.5f);
    ray.direction = d_;
    ray.dOdx = h_;
    ray.dOdy = v_;
    ray.dDdx = ray.dDdy = Vec3();
}

bool EnvCamera::projectionFromIndex(int index, Projection &out) {
    if (index < 0 || index > 2) return false;
    out = static_cast<Projection>(index);
    return true;
}

EnvCamera::EnvCamera(std::string name, const Mtx4 &objectToWorld,
                     const EnvironmentHandle *env, Projection projection)
    : Camera(std::move(name), objectToWorld, env), projection_(projection) {}

bool EnvCamera::direction(float s, float t, Vec3 &dir) const {
    if (!(s >= 0.0f && s <= 1.0f && t >= 0.0f && t <= 1.0f)) return false;
    switch (projection_) {
        case kCubeMap: {
            // The far edges (s or t exactly 1) belong to the last column and row.
            int i = std::min(int(3.0f * s), 2), j = std::min(int(4.0f * t), 3);
            float a = 3.0f * s - float(i) - 0.5f, b = 4.0f * t - float(j) - 0.5f;
            if (i == 0 && j == 1) {
                dir = {-0.5f, -b, a};
            } else if (i == 2 && j == 1) {
                dir = {0.5f, -b, -a};
            } else if (i == 1 && j == 0) {
                dir = {a, 0.5f, b};
            } else if (i == 1 && j == 1) {
                dir = {a, -b, 0.5f};
            } else if (i == 1 && j == 2) {
                dir = {a, -0.5f, -b};
            } else if (i == 1 && j == 3) {
                dir = {a, b, -0.5f};
            } else {
                return false;
            }
            break;
        }
        case kBall: {
            float q = 0.25f - (s - 0.5f) * (s - 0.5f) - (t - 0.5f) * (t - 0.5f);
            if (q < 0.0f) return false;
            float nz = 2.0f * std::sqrt(q);
            dir = {(2.0f * s - 1.0f) * 2.0f * nz, -(2.0f * t - 1.0f) * 2.0f * nz,
                   2.0f * nz * nz - 1.0f};
            break;
        }
        case kLatLong: {
            float theta = kPi * t, phi = kPi * (2.0f * s + 0.5f);
            dir = {std::cos(phi) * std::sin(theta), std::cos(theta),
                   -std::sin(phi) * std::sin(theta)};
            break;
        }
        default:
            return false;
    }
    dir.normalize();
    return true;
}

void EnvCamera::generateRay(const Vec2 &image, const Vec2 &lens, Ray &ray) const {
    float s = image.x, t = 1.0f - image.y;
    ray.dOdx = ray.dOdy = Vec3();
    Vec3 dir;
    if (!direction(s, t, dir)) {
        ray.type = kRayEnvironment;
        ray.origin = pos_;
        ray.direction = {0.0f, 1.0f, 0.0f};
        ray.dDdx = ray.dDdy = Vec3();
        return;
    }
    ray.type = kRayPrimary;
    ray.direction = dir;
    ray.origin = pos_;
    if (projection_ == kLatLong && pos_.length() < 1e-5f) ray.origin = {1e-5f, pos_.y, pos_.z};
    // Forward differences; at the edge of a covered region the backward difference stands in.
    constexpr float kStep = 0.001f;
    auto diff = [&](float ds, float dt) {
        Vec3 n;
        if (direction(s + ds, t + dt, n)) return (dir - n) * 1000.0f;
        if (direction(s - ds, t - dt, n)) return (n - dir) * 1000.0f;
        return Vec3();
    };
    ray.dDdx = diff(kStep, 0.0f);
    ray.dDdy = diff(0.0f, kStep);
}

}  // namespace ox
