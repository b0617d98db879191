#pragma once

#include <cstddef>
#include <cstdint>

#include "core/types.h"
#include "raytrace/ray.h"
#include "raytrace/surface_point.h"
#include "shading/light_context.h"

/// The state one shading call works on: the surface point, the ray that found it and the
/// per-thread tools, plus the read-only scene every thread shares.
///
/// How a caller shades a sample (camera render, texture bake, GI gather):
///   1. Once per run: fill a ShadingScene (acceleration structure, lights, light links,
///      environments, the optional indirect-light integrator and hit resolver, settings).
///   2. Once per thread: a ShadingContext with scene, random and rays set; the rest is
///      rewritten per sample.
///   3. Per sample: beginSample() with the ray (a bake: from above the texel's point along
///      -normal), then the surface: surfacePoint(ray, hit, instance, ctx.surface) for a hit, or
///      the texel's position, normals, tangent frame and UV sets for a bake; then ask a pass for
///      its colour: pass.shade(ctx, material) (shading/pass.h), material =
///      materialOf(ctx.surface.material)->surface(). A ray that hits nothing gets
///      environmentColor(ctx) (shading/trace.h).
/// No shading call allocates or locks; the only virtual calls per sample are the pass's and
/// the material's `shade`.
namespace ox {

class ADSInterface;
class CompleteGrid;
class Instance;
class EnvironmentShaderInterface;
class LightSource;
class Random;
class SurfaceShaderInterface;
struct ShadingContext;

/// The shading components: bits of a shading context's component mask and of a render pass's
/// mask. Lights carry the same bits as their flags (which components they feed).
enum ShadingComponent : uint32_t {
    kShadeNone = 0x0,
    kShadeDiffuse = 0x1,
    kShadeSpecular = 0x2,
    kShadeAmbient = 0x4,
    kShadeReflections = 0x8,
    kShadeRefractions = 0x10,
    kShadeSubSurface = 0x20,
    kShadeShadows = 0x40,
    kShadeIncandescence = 0x80,
    kShadeIndirect = 0x100,
    kShadeAll = 0xFFFFFFFFu,
};

/// Deepest secondary ray of any kind, whatever the settings ask: the per-kind depths of a
/// context are bytes, and every level holds a context on the stack.
constexpr uint32_t kMaxSecondaryDepth = 255;

/// Indirect light of the global-illumination integrators, as shading asks for it.
class IndirectLightInterface {
public:
    virtual ~IndirectLightInterface() = default;
    /// Irradiance arriving at the context's point from all other surfaces, cosine-weighted
    /// like the direct light of Phong's diffuse sum (the sum the diffuse colour multiplies).
    virtual Color irradiance(ShadingContext &ctx) const = 0;
};

/// Turns a hit of a secondary ray into a surface point: fills the surface fields of ctx (the
/// ray fields are already set) and names the surface shader there. Implemented where
/// instances and their materials are known.
class HitResolverInterface {
public:
    virtual ~HitResolverInterface() = default;
    /// The surface shader at the hit (null: nothing to shade, the hit counts as black).
    virtual const SurfaceShaderInterface *resolve(const Ray &ray, const Hit &hit,
                                                  ShadingContext &ctx) const = 0;
};

/// The render settings shading obeys.
struct ShadingSettings {
    uint32_t maxRayDepth = 6;
    uint32_t reflectionDepth = 2;
    uint32_t refractionDepth = 4;
    uint32_t transparencyDepth = 50;
    uint32_t giTransparencyDepth = 2;
    uint32_t shadowDepth = 2;
    /// Reflections and refractions weaker than this (luminance of the weight) are not traced.
    float reflectionThreshold = 0.001f;
    float refractionThreshold = 0.001f;
    bool ignoreLightLinks = false;
};

/// The read-only scene shading works in, shared by all render threads. Plain pointers into
/// objects the caller owns for the whole run.
struct ShadingScene {
    /// Acceleration structure for secondary rays (null: nothing is traced).
    const ADSInterface *ads = nullptr;
    /// What the lights' shadow samplers trace against: the acceleration structure, the ray
    /// bias (also the offset of secondary rays) and the render settings' shadow-ray bounds.
    ShadowTracer shadowTracer;
    /// The lights, in scene order (light linking indexes this order).
    const LightSource *const *lights = nullptr;
    uint32_t lightCount = 0;
    /// Light links: one bit row of lightLinkWords words per instance, bit j for light j
    /// (LightLinkTable::row). Null: every light reaches every instance.
    const uint64_t *lightLinks = nullptr;
    size_t lightLinkWords = 0;
    uint32_t lightLinkInstances = 0;
    /// Environments of rays that leave the scene: ray-traced rays and GI rays (null: black).
    const EnvironmentShaderInterface *rtEnvironment = nullptr;
    const EnvironmentShaderInterface *giEnvironment = nullptr;
    /// Indirect light of the GI integrators (null: no GI).
    const IndirectLightInterface *indirect = nullptr;
    /// The scene's instances by index (the hit's instance index), for the surface points of
    /// secondary-ray hits; grid is the structure behind ads (moving hits read their corners
    /// from it). Without instances or a resolver secondary rays see only the environment.
    const Instance *const *instances = nullptr;
    uint32_t instanceCount = 0;
    const CompleteGrid *grid = nullptr;
    /// Overrides the instances: turns secondary-ray hits into surface points (tests, tools).
    const HitResolverInterface *resolver = nullptr;
    ShadingSettings settings;

    /// True when light l reaches instance i (instances outside the table see every light).
    /// Sets the acceleration structure and the ray bias of secondary and shadow rays, and the
    /// shadow-ray bounds of the render settings.
    void setRayTracing(const ADSInterface *structure, float bias, uint32_t minShadowRays = 0,
                       uint32_t maxShadowRays = 0xFFFFFFFFu) {
        ads = shadowTracer.ads = structure;
        shadowTracer.bias = bias;
        shadowTracer.minShadowRays = minShadowRays;
        shadowTracer.maxShadowRays = maxShadowRays;
    }

    bool reaches(uint32_t instance, uint32_t light) const {
        if (!lightLinks || settings.ignoreLightLinks || instance >= lightLinkInstances ||
            light / 64 >= lightLinkWords)
            return true;
        return (lightLinks[size_t(instance) * lightLinkWords + light / 64] >> (light % 64)) & 1u;
    }
};

/// One shading call's state. A plain value: filled by the caller, copied for secondary rays.
struct ShadingContext {
    /// The surface point: position, normals (facing the front of the surface), tangent frame,
    /// UV sets with their derivatives and tangent frames, vertex colour, material, instance,
    /// its flags and the side the ray came from. surfacePoint() fills it for a ray hit; a bake
    /// fills it for a texel.
    SurfacePoint surface;

    // --- The ray ---
    Vec3 rayOrigin;
    /// Unit direction of travel of the ray that reached the point (bakes: -normal).
    Vec3 rayDirection{0, 0, -1};
    /// Distance from rayOrigin to the point (-1 when unknown).
    float rayDistance = -1.0f;
    /// Ray type (kRayPrimary for camera and bake samples, kRayFinalGather for GI gathers).
    uint8_t rayType = kRayPrimary;
    /// Ray depth (all bounces) and the depths per kind of secondary ray.
    uint8_t rayDepth = 0;
    uint8_t reflectionDepth = 0;
    uint8_t refractionDepth = 0;
    uint8_t transparencyDepth = 0;
    /// Weight of this ray's colour in the sample (multiplies R, G, B; alpha is its alpha).
    Color colorWeight = Color::white();
    /// Shading components to compute (ShadingComponent bits; kShadeAll: everything).
    uint32_t componentMask = kShadeAll;
    /// How much the sample matters (0..1): shadow samplers shrink their counts with it.
    float importance = 1.0f;
    /// Shadow samplers trace one ray only.
    bool singleShadowRay = false;
    /// Shutter time of the ray in [0, 1] (motion blur).
    float time = 0.0f;

    // --- Lights (the scene's unless a pass replaces them) ---
    const LightSource *const *lights = nullptr;
    uint32_t lightCount = 0;

    // --- Per thread ---
    Random *random = nullptr;
    RayCounter *rays = nullptr;

    // --- Shared ---
    const ShadingScene *scene = nullptr;

    /// True when the mask holds any of these component bits.
    bool allows(uint32_t components) const { return (componentMask & components) != 0; }
    /// True for rays of the GI integrators.
    bool isGIRay() const { return rayType == kRayFinalGather; }

    /// Starts a new sample of a camera or bake ray: ray fields set, depths, weight, mask,
    /// importance and lights reset to the scene's. The surface fields are the caller's to set.
    void beginSample(const Vec3 &origin, const Vec3 &direction, uint8_t type = kRayPrimary) {
        rayOrigin = origin;
        rayDirection = direction;
        rayDistance = -1.0f;
        rayType = type;
        rayDepth = reflectionDepth = refractionDepth = transparencyDepth = 0;
        colorWeight = Color::white();
        componentMask = kShadeAll;
        importance = 1.0f;
        singleShadowRay = false;
        useSceneLights();
    }
    /// Points the light list at the scene's lights.
    void useSceneLights() {
        lights = scene ? scene->lights : nullptr;
        lightCount = scene ? scene->lightCount : 0;
    }
    /// True when light index l of the current list reaches the instance hit (light links
    /// apply to the scene's own list only).
    bool lightReaches(uint32_t l) const {
        return !scene || lights != scene->lights || scene->reaches(surface.instanceIndex, l);
    }
    /// The secondary-ray offset (the scene's ray bias).
    float bias() const {
        return scene && scene->shadowTracer.bias > 0.0f ? scene->shadowTracer.bias : 0.0f;
    }
};

}  // namespace ox
