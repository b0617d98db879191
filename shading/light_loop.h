#pragma once

#include <cmath>
#include <cstdint>

#include "core/types.h"
#include "shading/light.h"
#include "shading/shading_context.h"

/// The shading code's one way of asking a light for its light at a point, and the loop over
/// the lights that reach a point (light links applied).
namespace ox {

/// One light's light at a point.
struct LightSample {
    /// Light arriving at the point (shadowed when asked), before the cosine.
    Color color;
    /// Unit direction from the point to the light.
    Vec3 direction;
    /// Cosine factor of the light at the point for the normal (may be negative).
    float cosine = 0.0f;
};

/// The light operations' view of a shading context: its thread's generator and ray counter,
/// ray type and depth, and the scene's shadow tracer; shadows only when asked.
inline LightContext lightContext(const ShadingContext &ctx, bool withShadow) {
    LightContext lc;
    lc.tracer = ctx.scene ? &ctx.scene->shadowTracer : nullptr;
    lc.random = ctx.random;
    lc.counter = ctx.rays;
    lc.rayType = ctx.rayType;
    lc.rayDepth = ctx.rayDepth;
    lc.allowShadows = withShadow;
    lc.singleShadowRay = ctx.singleShadowRay;
    lc.time = ctx.time;
    return lc;
}

/// The light of l at point p with normal n for the context's ray; withShadow multiplies by
/// the light's shadow transmission.
inline void sampleLight(const LightSource &l, ShadingContext &ctx, const Vec3 &p, const Vec3 &n,
                        bool withShadow, LightSample &out) {
    LightContext lc = lightContext(ctx, withShadow);
    out.color = l.illuminate(p, n, lc, withShadow);
    out.direction = l.directionToLight(p);
    out.cosine = l.cosineFactor(p, n);
}

/// The shadowed and the unshadowed light of l at p, and its cosine factor for n.
inline void sampleLightBoth(const LightSource &l, ShadingContext &ctx, const Vec3 &p,
                            const Vec3 &n, Color &shadowed, Color &unshadowed, float &cosine) {
    LightContext lc = lightContext(ctx, true);
    l.illuminateBoth(shadowed, unshadowed, p, n, lc);
    cosine = l.cosineFactor(p, n);
}

/// Calls f(light, index) for every light of the context's list that reaches its instance and
/// can contribute at p.
template <typename F>
void forEachLight(const ShadingContext &ctx, const Vec3 &p, F &&f) {
    for (uint32_t i = 0; i < ctx.lightCount; ++i) {
        const LightSource *l = ctx.lights[i];
        if (!l || !ctx.lightReaches(i) || !l->affectsPoint(p)) continue;
        f(*l, i);
    }
}

/// The light's flag bits.
inline uint32_t lightFlags(const LightSource &l) { return l.flags(); }

/// The cosine weight a light gets in the diffuse sum under mask: max(0, cosine) for lights
/// that feed diffuse, 1 for lights that feed only ambient; negative when the light adds
/// nothing under this mask.
inline float diffuseWeight(uint32_t lightFlags, uint32_t mask, float cosine) {
    if ((lightFlags & kShadeDiffuse) && (mask & kShadeDiffuse)) return std::fmax(0.0f, cosine);
    if ((lightFlags & kShadeAmbient) && (mask & kShadeAmbient)) return 1.0f;
    return -1.0f;
}

}  // namespace ox
