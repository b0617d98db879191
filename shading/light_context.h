#pragma once

#include <cstdint>

#include "core/types.h"
#include "raytrace/ray.h"

namespace ox {

class ADSInterface;
class Random;

/// What a shadow ray keeps of its light where it passes a surface. The code that knows the
/// scene's materials implements it; shadow rays ask it once per surface they pass, and only
/// when a tracer has one (without it every surface is opaque).
class ShadowTransparencyInterface {
public:
    virtual ~ShadowTransparencyInterface() = default;
    /// The transparency colour of the surface hit by a shadow ray: white passes all light,
    /// black (the answer for opaque surfaces) none. Channels are taken within [0, 1].
    virtual Color transparency(const Ray &ray, const Hit &hit) const = 0;
};

/// Scene-wide, read-only inputs of shadow tracing, set up once before rendering and shared by
/// every render thread.
struct ShadowTracer {
    /// The occlusion queries of the scene; null traces no shadow rays (full transmission).
    const ADSInterface *ads = nullptr;
    /// The scene's ray bias: shadow rays start and stop this far from their ends, and distance
    /// attenuation never sees a distance below it.
    float bias = 0.005f;
    /// The render settings' bounds on the shadow rays of one light (minShadowRays,
    /// maxShadowRays); the samplers never trace fewer than 1 or more than 256.
    uint32_t minShadowRays = 0;
    uint32_t maxShadowRays = 0xFFFFFFFFu;
    /// The transparency of the surfaces shadow rays pass; null: every surface is opaque.
    const ShadowTransparencyInterface *transparency = nullptr;
};

/// The calling thread's state for the light operations: owned by one render thread, never shared,
/// so the lights need no locks. Everything the lights change (the generator and the counter)
/// belongs to the caller.
struct LightContext {
    const ShadowTracer *tracer = nullptr;  ///< Null: no shadow rays, bias 0.
    Random *random = nullptr;       ///< The thread's generator (null: the centre of every stratum).
    RayCounter *counter = nullptr;  ///< Counts the shadow rays (may be null).
    uint8_t rayType = kRayPrimary;  ///< Ray type of the shading context: picks the light's scale.
    uint8_t rayDepth = 0;           ///< Depth of the ray being shaded.
    bool allowShadows = true;       ///< False: every transmission is white.
    bool singleShadowRay = false;   ///< One shadow ray per light (GI gathers and the like).
    float time = 0.0f;              ///< Shutter time of the shadow rays.

    /// The scene's ray bias (0 without a tracer; negative or NaN biases count as 0).
    float bias() const { return tracer && tracer->bias > 0.0f ? tracer->bias : 0.0f; }
};

/// A colour lookup by texture coordinates with a unit filter footprint: what gobos and light
/// probes need from a texture. The texture code implements it; lookups happen once per light
/// query, never per shadow ray.
class TextureLookupInterface {
public:
    virtual ~TextureLookupInterface() = default;
    /// The colour at (u, v); [0, 1]^2 covers the image once, row v = 0 at the bottom.
    virtual Color lookup(float u, float v) const = 0;
};

}  // namespace ox
