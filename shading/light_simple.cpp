// The operations of the direct, ambient, environment and albedo lights.
#include <algorithm>
#include <cmath>

#include "core/random.h"
#include "shading/light.h"

namespace ox {
namespace {

constexpr float kPi = 3.14159265358979f;

// R, G and B multiplied by the grey transmission, alpha kept.
inline Color shadowedRgb(const Color &c, const Color &t) {
    return Color(c.r * t.r, c.g * t.g, c.b * t.b, c.a);
}

// Solid angle of the triangle of unit vectors a, b, c seen from their origin.
float triangleSolidAngle(const Vec3 &a, const Vec3 &b, const Vec3 &c) {
    const float num = std::fabs(dot(a, cross(b, c)));
    const float den = 1.0f + dot(a, b) + dot(b, c) + dot(a, c);
    return 2.0f * std::atan2(num, den);
}

}  // namespace

Color LightSource::shadowTransmission(const Vec3 &, LightContext &, float) const {
    return Color::white();
}

void LightSource::illuminateBoth(Color &shadowed, Color &unshadowed, const Vec3 &p, const Vec3 &n,
                                 LightContext &ctx) const {
    unshadowed = illuminate(p, n, ctx, false);
    shadowed = shadowedRgb(unshadowed, shadowTransmission(p, ctx, 1.0f));
}

// Point light.

Color SimplePointLight::unshadowed(const Vec3 &p, const LightContext &ctx) const {
    if (ramp_.empty()) {
        const float a = attenuationAt((p - position_).length(), ctx);
        if (color_.luminance() * a < kLightCutLuminance) return Color::black();
        return color_ * (a * intensityScale(ctx.rayType));
    }
    const Color r = ramp_.lookup(worldToLight_.transformPoint(p).length());
    return color_ * r * intensityScale(ctx.rayType);
}

Color SimplePointLight::illuminate(const Vec3 &p, const Vec3 &, LightContext &ctx,
                                   bool withShadow) const {
    Color c = unshadowed(p, ctx);
    if (withShadow && c.luminance() > 0.0f) c = c * shadowTransmission(p, ctx, 1.0f);
    return c;
}

Color SimplePointLight::shadowTransmission(const Vec3 &p, LightContext &ctx,
                                           float importance) const {
    if (!castsShadowsFor(ctx)) return Color::white();
    return tracePointShadow(shadow_, position_, p, ctx, importance);
}

bool SimplePointLight::affectsPoint(const Vec3 &p) const {
    if (ramp_.empty()) return (p - position_).lengthSquared() < cutoff2_;
    return worldToLight_.transformPoint(p).lengthSquared() < 1.0f;
}

// Spot light.

float SimpleSpotLight::coneFalloff(float c) const {
    if (!(c >= cosOuter_)) return 0.0f;
    if (c >= cosInner_) return 1.0f;
    const float t = 1.0f - (c - cosInner_) / (cosOuter_ - cosInner_);
    return std::pow(std::clamp(t, 0.0f, 1.0f), penumbraExponent_);
}

bool SimpleSpotLight::goboCoordinates(const Vec3 &d, float &u, float &v) const {
    const float along = dot(axis_, d);
    if (!(along > 1e-6f)) return false;
    const float k = goboScale_ / along;
    u = dot(goboU_, d) * k + 0.5f;
    v = dot(goboV_, d) * k + 0.5f;
    return true;
}

Color SimpleSpotLight::illuminate(const Vec3 &p, const Vec3 &, LightContext &ctx,
                                  bool withShadow) const {
    // The cone is measured in light space, where the axis is -y.
    const Vec3 local = worldToLight_.transformPoint(p);
    const float len = local.length();
    if (!(len > 0.0f)) return Color::black();
    const float falloff = coneFalloff(-local.y / len);
    if (falloff <= 0.0f) return Color::black();
    Color c = unshadowed(p, ctx) * falloff;
    if (c.luminance() <= 0.0f) return c;
    if (gobo_) {
        float u, v;
        if (!goboCoordinates((p - position_).normalized(), u, v)) return Color::black();
        c = c * gobo_->lookup(u, v);
    }
    if (withShadow) c = c * shadowTransmission(p, ctx, 1.0f);
    return c;
}

// Directional light.

Color SimpleDirectionalLight::illuminate(const Vec3 &p, const Vec3 &, LightContext &ctx,
                                         bool withShadow) const {
    Color c = color_ * intensityScale(ctx.rayType);
    if (withShadow && c.luminance() > 0.0f) c = c * shadowTransmission(p, ctx, 1.0f);
    return c;
}

Color SimpleDirectionalLight::shadowTransmission(const Vec3 &p, LightContext &ctx,
                                                 float importance) const {
    if (!castsShadowsFor(ctx)) return Color::white();
    return traceDirectionalShadow(shadow_, direction_, nullptr, p, ctx, importance);
}

// Area light.

Color SimpleAreaLight::illuminate(const Vec3 &p, const Vec3 &, LightContext &ctx,
                                  bool withShadow) const {
    const Vec3 fromCenter = p - center_;
    if (dot(normal_, fromCenter) < 0.0f) return Color::black();
    float a = attenuationAt(fromCenter.length(), ctx);
    if (clampToIntensity_) a = std::fmin(a, 1.0f);
    if (color_.luminance() * a < kLightCutLuminance) return Color::black();
    Color c = color_ * (a * intensityScale(ctx.rayType));
    if (withShadow) c = c * shadowTransmission(p, ctx, 1.0f);
    return c;
}

Color SimpleAreaLight::shadowTransmission(const Vec3 &p, LightContext &ctx,
                                          float importance) const {
    if (!castsShadowsFor(ctx)) return Color::white();
    return traceAreaShadow(shadow_, objectToWorld_, p, ctx, importance);
}

float SimpleAreaLight::cosineFactor(const Vec3 &p, const Vec3 &n) const {
    // Corners as unit vectors from p; the rectangle's solid angle from two triangles.
    Vec3 c[4];
    for (int i = 0; i < 4; ++i) c[i] = (corners_[i] - p).normalized();
    const float omega = triangleSolidAngle(c[0], c[1], c[2]) + triangleSolidAngle(c[0], c[2], c[3]);
    if (!(omega > 1e-7f)) return dot((center_ - p).normalized(), n);
    // Clip the rectangle (as vectors from p) to the hemisphere of n.
    Vec3 in[4], out[8];
    for (int i = 0; i < 4; ++i) in[i] = corners_[i] - p;
    int m = 0;
    for (int i = 0; i < 4; ++i) {
        const Vec3 &a = in[i], &b = in[(i + 1) % 4];
        const float da = dot(a, n), db = dot(b, n);
        if (da >= 0.0f) out[m++] = a;
        if ((da >= 0.0f) != (db >= 0.0f)) out[m++] = a + (b - a) * (da / (da - db));
    }
    if (m < 3) return 0.0f;
    // The integral of cos over the clipped polygon by its edges (Lambert's formula).
    float integral = 0.0f;
    for (int i = 0; i < m; ++i) {
        const Vec3 a = out[i].normalized(), b = out[(i + 1) % m].normalized();
        const Vec3 g = cross(a, b);
        const float gl = g.length();
        if (!(gl > 0.0f)) continue;
        const float angle = std::atan2(gl, dot(a, b));
        integral += angle * dot(g, n) / gl;
    }
    return std::clamp(0.5f * std::fabs(integral) / omega, 0.0f, 1.0f);
}

Vec3 SimpleAreaLight::directionToLightSurface(const Vec3 &p) const {
    // The nearest point of the rectangle: p in light space, clamped to the square.
    const Vec3 local = worldToLight_.transformPoint(p);
    const Vec3 onSquare(std::clamp(local.x, -1.0f, 1.0f), std::clamp(local.y, -1.0f, 1.0f), 0.0f);
    const Vec3 d = objectToWorld_.transformPoint(onSquare) - p;
    return std::isfinite(d.x + d.y + d.z) ? d.normalized() : directionToLight(p);
}

bool SimpleAreaLight::affectsPoint(const Vec3 &p) const {
    const Vec3 d = p - center_;
    return dot(normal_, d) >= 0.0f && d.lengthSquared() < cutoff2_;
}

// Window light.

Color SimpleWindowLight::shadowTransmission(const Vec3 &p, LightContext &ctx,
                                            float importance) const {
    if (!castsShadowsFor(ctx)) return Color::white();
    const WindowClip clip{center_, normal_, &worldToLight_};
    return traceDirectionalShadow(shadow_, -normal_, &clip, p, ctx, importance);
}

// Ambient light.

Color SimpleAmbientLight::illuminate(const Vec3 &, const Vec3 &, LightContext &ctx, bool) const {
    return color_ * intensityScale(ctx.rayType);
}

// Environment light.

namespace {

// The unit direction of the cosine-weighted hemisphere around n for (s, t) in [0, 1]^2: s = r^2
// picks the ring (so equal steps of s hold equal cosine-weighted shares), t the angle about n.
inline Vec3 hemisphereDirection(float s, float t, const Vec3 &n, const Vec3 &u, const Vec3 &v) {
    const float r = std::sqrt(std::clamp(s, 0.0f, 1.0f));
    const float phi = 2.0f * kPi * t;
    const float z = std::sqrt(std::max(0.0f, 1.0f - r * r));
    return u * (r * std::cos(phi)) + v * (r * std::sin(phi)) + n * z;
}

}  // namespace

Color EnvironmentLight::illuminate(const Vec3 &p, const Vec3 &n, LightContext &ctx,
                                   bool withShadow) const {
    Vec3 u, v;
    const Vec3 w = n.normalized();
    if (!(w.lengthSquared() > 0.5f)) return Color::black();
    perpendicularBasis(w, u, v);
    Color sum;
    const bool traced = withShadow && castsShadowsFor(ctx) && ctx.tracer && ctx.tracer->ads &&
                        ctx.rayDepth < kShadowDepthLimit;
    if (!traced) {
        // A fixed, deterministic quadrature: the centres of 8 rings of equal cosine-weighted
        // share times 8 sectors.
        constexpr int kSide = kQuadratureSide;
        for (int j = 0; j < kSide; ++j)
            for (int i = 0; i < kSide; ++i) {
                const float a = (float(i) + 0.5f) / kSide, b = (float(j) + 0.5f) / kSide;
                sum += shader_->evaluateDirection(hemisphereDirection(a, b, w, u, v));
            }
        return sum * (intensityScale(ctx.rayType) / float(kSide * kSide));
    }
    ShadowSamplerSettings s;
    s.samples = kShadowSamples;
    const ShadowGrid g = shadowGridLayout(shadowSampleCount(s, ctx, 1.0f));
    const float reach = 1e16f;
    for (uint32_t j = 0; j < g.ny; ++j)
        for (uint32_t i = 0; i < g.nx; ++i) {
            const float r1 = ctx.random ? ctx.random->next() : 0.5f;
            const float r2 = ctx.random ? ctx.random->next() : 0.5f;
            const Vec3 d =
                hemisphereDirection((float(i) + r1) / g.nx, (float(j) + r2) / g.ny, w, u, v);
            sum += shader_->evaluateDirection(d) * shadowSegmentTransmission(p, p + d * reach, ctx);
        }
    return sum * (intensityScale(ctx.rayType) / float(uint32_t(g.nx) * g.ny));
}

void EnvironmentLight::illuminateBoth(Color &shadowed, Color &unshadowed, const Vec3 &p,
                                      const Vec3 &n, LightContext &ctx) const {
    // The shadow of an environment depends on the normal, which shadowTransmission lacks.
    unshadowed = illuminate(p, n, ctx, false);
    shadowed = illuminate(p, n, ctx, true);
}

}  // namespace ox
