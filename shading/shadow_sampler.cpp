#include "shading/shadow_sampler.h"

#include <algorithm>
#include <array>
#include <cmath>

#include "config/settings_render.h"
#include "core/random.h"
#include "raytrace/complete_grid.h"

namespace ox {
namespace {

constexpr float kPi = 3.14159265358979f;
constexpr float kDirectionalReach = 1e16f;

// The layouts for 0 to 256 samples, made at compile time (entry 0 is never used).
constexpr std::array<ShadowGrid, kMaxShadowSamples + 1> makeGridTable() {
    std::array<ShadowGrid, kMaxShadowSamples + 1> t{};
    for (uint32_t n = 1; n <= kMaxShadowSamples; ++n) {
        uint32_t nx = 1;
        while ((nx + 1) * (nx + 1) <= n) ++nx;
        t[n] = ShadowGrid{uint16_t(nx), uint16_t(n / nx)};
    }
    return t;
}
constexpr std::array<ShadowGrid, kMaxShadowSamples + 1> kGridTable = makeGridTable();

// A draw of the thread's generator, or the stratum centre without one.
inline float draw(LightContext &ctx) { return ctx.random ? ctx.random->next() : 0.5f; }

inline Color gray(float f) { return Color(f, f, f, f); }

// Shared loop of the samplers: target(a, b) gives the ray target for the square coordinates
// (a, b) in [-1, 1]^2, or false when the ray is blocked without tracing. Opaque scenes count
// the open rays; with transparent surfaces the transmitted colours are averaged.
template <typename Target>
Color stratified(uint32_t n, LightContext &ctx, const Vec3 &p, Target &&target) {
    const ShadowGrid g = shadowGridLayout(n);
    const float sx = 2.0f / float(g.nx), sy = 2.0f / float(g.ny);
    const float count = float(uint32_t(g.nx) * g.ny);
    const bool opaque = ctx.tracer->transparency == nullptr;
    uint32_t open = 0;
    Color sum;
    for (uint32_t j = 0; j < g.ny; ++j)
        for (uint32_t i = 0; i < g.nx; ++i) {
            const float r1 = draw(ctx), r2 = draw(ctx);
            const float a = (float(i) + r1) * sx - 1.0f, b = (float(j) + r2) * sy - 1.0f;
            Vec3 q;
            if (!target(a, b, q)) continue;
            if (opaque)
                open += shadowSegmentBlocked(p, q, ctx) ? 0u : 1u;
            else
                sum += shadowSegmentTransmission(p, q, ctx);
        }
    if (opaque) return gray(float(open) / count);
    return Color(sum.r / count, sum.g / count, sum.b / count, sum.a / count);
}

// A transparency channel within [0, 1] (NaN counts as opaque).
inline float channel(float c) { return c > 0.0f ? (c < 1.0f ? c : 1.0f) : 0.0f; }

// The steps every sampler starts with: white at the depth limit or without occlusion queries.
inline bool traces(const ShadowSamplerSettings &s, const LightContext &ctx) {
    return ctx.rayDepth < s.depthLimit && ctx.tracer && ctx.tracer->ads;
}

}  // namespace

ShadowTracer shadowTracerFor(const RenderSettingsBase &render, const ADSInterface *structure) {
    ShadowTracer t;
    t.ads = structure;
    const float bias = render.bias();
    t.bias = bias > 0.0f && std::isfinite(bias) ? bias : kDefaultShadowBias;
    t.minShadowRays = render.minShadowRays();
    t.maxShadowRays = render.maxShadowRays();
    return t;
}

ShadowGrid shadowGridLayout(uint32_t n) {
    return kGridTable[std::clamp<uint32_t>(n, 1, kMaxShadowSamples)];
}

uint32_t shadowSampleCount(const ShadowSamplerSettings &s, const LightContext &ctx,
                           float importance) {
    if (ctx.singleShadowRay) return 1;
    const double imp = importance > 0.0f ? std::min(double(importance), 1.0) : 0.0;
    int64_t n = int64_t(std::floor(double(s.samples) * std::sqrt(imp)));
    n = std::max<int64_t>(n, s.minSamples);
    if (ctx.tracer) {
        n = std::max<int64_t>(n, ctx.tracer->minShadowRays);
        n = std::min<int64_t>(n, ctx.tracer->maxShadowRays);
    }
    return uint32_t(std::clamp<int64_t>(n, 1, kMaxShadowSamples));
}

Vec2 concentricDisk(float a, float b) {
    if (a == 0.0f && b == 0.0f) return Vec2(0.0f, 0.0f);
    float r, phi;
    if (std::fabs(a) > std::fabs(b)) {
        r = a;
        phi = (kPi / 4.0f) * (b / a);
    } else {
        r = b;
        phi = kPi / 2.0f - (kPi / 4.0f) * (a / b);
    }
    return Vec2(r * std::cos(phi), r * std::sin(phi));
}

void perpendicularBasis(const Vec3 &w, Vec3 &u, Vec3 &v) {
    Vec3 axis(0, 0, 1);
    if (w.x > -0.6f && w.x < 0.6f)
        axis = Vec3(1, 0, 0);
    else if (w.y > -0.6f && w.y < 0.6f)
        axis = Vec3(0, 1, 0);
    u = cross(w, axis).normalized();
    v = cross(w, u);
}

bool shadowSegmentBlocked(const Vec3 &p, const Vec3 &target, LightContext &ctx) {
    const float bias = ctx.bias();
    Vec3 d = target - p;
    const float len = d.length();
    if (!(len > 2.0f * bias) || !std::isfinite(len)) return false;
    d *= 1.0f / len;
    Ray ray;
    ray.origin = p + d * bias;
    ray.direction = d;
    ray.type = kRayShadow;
    ray.time = ctx.time;
    return ctx.tracer->ads->occluded(ray, len - 2.0f * bias, ctx.counter);
}

Color shadowSegmentTransmission(const Vec3 &p, const Vec3 &target, LightContext &ctx) {
    const ShadowTransparencyInterface *transparency = ctx.tracer->transparency;
    if (!transparency)
        return shadowSegmentBlocked(p, target, ctx) ? Color::black() : Color::white();
    const float bias = ctx.bias();
    Vec3 d = target - p;
    const float len = d.length();
    if (!(len > 2.0f * bias) || !std::isfinite(len)) return Color::white();
    d *= 1.0f / len;
    Ray ray;
    ray.origin = p + d * bias;
    ray.direction = d;
    ray.type = kRayShadow;
    ray.time = ctx.time;
    float remaining = len - 2.0f * bias;
    float r = 1.0f, g = 1.0f, b = 1.0f;
    for (int k = 0; k < kMaxTransparentHits; ++k) {
        Hit hit;
        if (!ctx.tracer->ads->intersect(ray, hit, remaining, ctx.counter) || !hit.found())
            return Color(r, g, b, (r + g + b) / 3.0f);
        const Color t = transparency->transparency(ray, hit);
        r *= channel(t.r), g *= channel(t.g), b *= channel(t.b);
        if (!(r > 0.0f || g > 0.0f || b > 0.0f)) return Color::black();
        // Go on past the surface.
        const float step = hit.t + bias;
        remaining -= step;
        if (!(remaining > 0.0f)) return Color(r, g, b, (r + g + b) / 3.0f);
        ray.origin = ray.origin + d * step;
    }
    return Color::black();
}

Color tracePointShadow(const ShadowSamplerSettings &s, const Vec3 &lightPosition, const Vec3 &p,
                       LightContext &ctx, float importance) {
    if (!traces(s, ctx)) return Color::white();
    // Every ray towards a disk of radius 0 is the same ray: one ray, no draws.
    const float radius = s.size > 0.0f && std::isfinite(s.size) ? s.size : 0.0f;
    if (radius == 0.0f) return shadowSegmentTransmission(p, lightPosition, ctx);
    const Vec3 w = (lightPosition - p).normalized();
    Vec3 u, v;
    perpendicularBasis(w, u, v);
    const uint32_t n = shadowSampleCount(s, ctx, importance);
    u *= radius;
    v *= radius;
    return stratified(n, ctx, p, [&](float a, float b, Vec3 &q) {
        const Vec2 d = concentricDisk(a, b);
        q = lightPosition + u * d.x + v * d.y;
        return true;
    });
}

Color traceAreaShadow(const ShadowSamplerSettings &s, const Mtx4 &objectToWorld, const Vec3 &p,
                      LightContext &ctx, float importance) {
    if (!traces(s, ctx)) return Color::white();
    const uint32_t n = shadowSampleCount(s, ctx, importance);
    return stratified(n, ctx, p, [&](float a, float b, Vec3 &q) {
        q = objectToWorld.transformPoint(Vec3(a, b, 0.0f));
        return true;
    });
}

Color traceDirectionalShadow(const ShadowSamplerSettings &s, const Vec3 &toLight,
                             const WindowClip *window, const Vec3 &p, LightContext &ctx,
                             float importance) {
    if (!traces(s, ctx)) return Color::white();
    Vec3 u, v;
    perpendicularBasis(toLight, u, v);
    // Half-angles of 90 degrees or more would turn rays away from the light: the spread stops
    // just short of the horizon.
    const float angle = std::clamp(std::isfinite(s.size) ? s.size : 0.0f, 0.0f, 1.5f);
    const float spread = std::tan(angle);
    const uint32_t n = spread > 0.0f ? shadowSampleCount(s, ctx, importance) : 1;
    if (spread == 0.0f && !window)
        return shadowSegmentTransmission(p, p + toLight * kDirectionalReach, ctx);
    u *= spread;
    v *= spread;
    return stratified(n, ctx, p, [&](float a, float b, Vec3 &q) {
        const Vec2 d = concentricDisk(a, b);
        const Vec3 dir = (toLight + u * d.x + v * d.y).normalized();
        if (!window) {
            q = p + dir * kDirectionalReach;
            return true;
        }
        // The ray leaves through the window plane; outside the window's rectangle is wall.
        const float den = dot(dir, window->normal);
        const float t = dot(window->center - p, window->normal) / den;
        if (!(t > 0.0f) || !std::isfinite(t)) return false;
        q = p + dir * t;
        const Vec3 local = window->worldToWindow->transformPoint(q);
        return std::fabs(local.x) <= 1.0f && std::fabs(local.y) <= 1.0f;
    });
}

}  // namespace ox
