#include "shading/light_loop.h"

#include <cmath>

#include "shading/light.h"

namespace ox {
namespace {

// Unshadowed light of the light kinds whose data the light classes expose, until the lights
// answer for themselves.
Color unshadowedLight(const LightSource &l, const ShadingContext &ctx, const Vec3 &p,
                      Vec3 &direction, float &cosine, const Vec3 &n) {
    const float scale = l.intensityScale(ctx.rayType);
    if (auto *pl = dynamic_cast<const SimplePointLight *>(&l)) {
        Vec3 d = pl->position() - p;
        const float dist = d.length();
        direction = dist > 0.0f ? d * (1.0f / dist) : Vec3();
        cosine = dot(direction, n);
        float a = 1.0f;
        if (pl->ramp().empty()) {
            a = pl->attenuation() ? pl->attenuation()->attenuate(dist) : 1.0f;
            if (!(pl->color().luminance() * a >= 0.0005f)) return Color::black();
        }
        const Color r = pl->ramp().lookup(pl->worldToLight().transformPoint(p).length());
        return pl->color() * r * (a * scale);
    }
    if (auto *dl = dynamic_cast<const SimpleDirectionalLight *>(&l)) {
        direction = dl->direction();
        cosine = dot(direction, n);
        return dl->color() * scale;
    }
    if (auto *al = dynamic_cast<const SimpleAmbientLight *>(&l)) {
        direction = Vec3(0, 1, 0);
        cosine = 1.0f;
        return al->color() * scale;
    }
    direction = Vec3();
    cosine = 0.0f;
    return Color::black();
}

}  // namespace

void sampleLight(const LightSource &l, ShadingContext &ctx, const Vec3 &p, const Vec3 &n,
                 bool withShadow, LightSample &out) {
    out.color = unshadowedLight(l, ctx, p, out.direction, out.cosine, n);
}

void sampleLightBoth(const LightSource &l, ShadingContext &ctx, const Vec3 &p, const Vec3 &n,
                     Color &shadowed, Color &unshadowed, float &cosine) {
    Vec3 d;
    unshadowed = unshadowedLight(l, ctx, p, d, cosine, n);
    shadowed = unshadowed;
}

bool lightAffects(const LightSource &l, const Vec3 &p) {
    if (auto *pl = dynamic_cast<const SimplePointLight *>(&l)) {
        if (pl->ramp().empty()) return (pl->position() - p).lengthSquared() < pl->cutoffSquared();
        return pl->worldToLight().transformPoint(p).lengthSquared() < 1.0f;
    }
    return true;
}

uint32_t lightFlags(const LightSource &l) { return l.flags(); }

}  // namespace ox
