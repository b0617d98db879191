#pragma once

#include <cstdint>

#include "core/types.h"
#include "shading/light_context.h"

/// Ray-traced shadow transmission: the stratified sample layout, the sample-count rule and the
/// three samplers (towards a disk around a point, over a rectangle, within a cone of directions).
namespace ox {

class RenderSettingsBase;

/// Ray bias of shadow rays when the render settings hold none that can be used.
constexpr float kDefaultShadowBias = 0.005f;

/// The shadow tracer of a run from its render settings: the ray bias (a bias that is not a
/// positive finite number gives kDefaultShadowBias), minShadowRays, maxShadowRays, and the
/// occlusion queries of the built acceleration structure (null: no shadow rays).
ShadowTracer shadowTracerFor(const RenderSettingsBase &render, const ADSInterface *structure);

/// Most shadow rays one sampler traces for one query.
constexpr uint32_t kMaxShadowSamples = 256;
/// Ray depth at which shadows are no longer traced.
constexpr int kShadowDepthLimit = 10;

/// How a light's shadow sampler samples.
struct ShadowSamplerSettings {
    /// kPoint: a disk around the light position (RTPointShadowSampler); kArea: the light's
    /// rectangle (RTAreaShadowSampler); kDirectional: a cone of directions, clipped at a window
    /// plane for window lights (RTDirectionalShadowSampler).
    enum Kind : int { kNone, kPoint, kArea, kDirectional };
    Kind kind = kNone;
    /// Disk radius (point), cone half-angle in radians (directional) or 0 (area: the rectangle).
    float size = 0.0f;
    /// Samples, at most 256 and at least 1.
    uint32_t samples = 1;
    /// The light's own least sample count (at most 256).
    uint32_t minSamples = 0;
    int depthLimit = kShadowDepthLimit;
    /// Window lights clip their rays at the window plane.
    bool clipAtPlane = false;
};

/// A stratified layout of nx by ny cells.
struct ShadowGrid {
    uint16_t nx = 1, ny = 1;
};

/// The layout for n samples: nx = floor(sqrt(n)), ny = floor(n / nx), so nx ny <= n (5 gives
/// 2 x 2, 6 gives 2 x 3, 8 gives 2 x 4). n is clamped to [1, 256].
ShadowGrid shadowGridLayout(uint32_t n);

/// Shadow rays for one query: 1 when the context asks for a single ray; else
/// floor(samples sqrt(importance)) with importance clamped to [0, 1] (NaN counts as 0), raised to
/// the light's and the render settings' minimum, lowered to the settings' maximum, and clamped to
/// [1, 256]. Computed in 64 bits.
uint32_t shadowSampleCount(const ShadowSamplerSettings &s, const LightContext &ctx,
                           float importance);

/// The concentric square-to-disk mapping of (a, b) in [-1, 1]^2 (the centre maps to the centre;
/// the half a < 0 maps to the half x < 0).
Vec2 concentricDisk(float a, float b);

/// Two unit vectors perpendicular to the unit vector w and to each other (built from the first
/// axis whose component of w lies strictly between -0.6 and 0.6).
void perpendicularBasis(const Vec3 &w, Vec3 &u, Vec3 &v);

/// True when something lies between p and target (the segment shortened by the bias at both
/// ends); a segment no longer than twice the bias is never blocked.
bool shadowSegmentBlocked(const Vec3 &p, const Vec3 &target, LightContext &ctx);

/// Most surfaces one shadow ray passes; a ray that meets more counts as blocked.
constexpr int kMaxTransparentHits = 64;

/// The colour that reaches p from target: white when nothing lies between, black past an
/// opaque surface, the product of the transparency colours of the surfaces passed when the
/// tracer knows them (alpha is the mean of R, G and B).
Color shadowSegmentTransmission(const Vec3 &p, const Vec3 &target, LightContext &ctx);

/// Transmission from p towards a disk of radius s.size around the light position, the disk
/// facing p.
Color tracePointShadow(const ShadowSamplerSettings &s, const Vec3 &lightPosition, const Vec3 &p,
                       LightContext &ctx, float importance);

/// Transmission from p towards the rectangle [-1, 1]^2 (z = 0) under objectToWorld.
Color traceAreaShadow(const ShadowSamplerSettings &s, const Mtx4 &objectToWorld, const Vec3 &p,
                      LightContext &ctx, float importance);

/// A window that clips directional shadow rays: the rectangle [-1, 1]^2 of a placement.
struct WindowClip {
    Vec3 center, normal;
    const Mtx4 *worldToWindow = nullptr;
};

/// Transmission from p along directions within s.size radians of the unit direction towards the
/// light; rays run 1e16 far, or with a window to their hit with the window plane (a hit outside
/// the window's rectangle counts as blocked).
Color traceDirectionalShadow(const ShadowSamplerSettings &s, const Vec3 &toLight,
                             const WindowClip *window, const Vec3 &p, LightContext &ctx,
                             float importance);

}  // namespace ox
