#pragma once

#include <cstdint>

#include "core/types.h"

/// Rays, ray types with their visibility rules, the hit record and the per-thread ray counter.
namespace ox {

/// Ray-type index carried by every ray.
enum RayType : uint8_t {
    kRayPrimary = 0,
    kRayReflection = 1,
    kRayRefraction = 2,
    kRayShadow = 3,
    kRayPhoton = 4,
    kRayFinalGather = 5,
    kRayGlossyReflection = 6,
    kRayEnvironment = 7,
    kRayOcclusion = 8,
    kRayEnvelope = 9,
    kRayImagePlane = 10,
    kRayTypeCount = 11,
};

/// RenderStats flag bits the tracer tests.
enum RenderStatsFlag : uint32_t {
    kFlagPrimaryVisibility = 0x1,
    kFlagCastShadows = 0x2,
    kFlagReceiveShadows = 0x4,
    kFlagMotionBlur = 0x8,
    kFlagSmoothShading = 0x10,
    kFlagVisibleInReflections = 0x20,
    kFlagVisibleInRefractions = 0x40,
    kFlagVisibleInFG = 0x80,
    kFlagDoubleSided = 0x100,
    kFlagOpposite = 0x200,
    kFlagCastGI = 0x400,
    kFlagReceiveGI = 0x800,
    kFlagStaticGI = 0x1000,
    kFlagSmoothGI = 0x2000,
    kFlagCastOcclusion = 0x4000,
    kFlagReceiveOcclusion = 0x8000,
    kFlagEnvelop = 0x10000,
    kFlagIsImagePlane = 0x20000,
    kFlagSelfOcclusion = 0x40000,
    kFlagShadowBias = 0x80000,
};

/// Flag bits of which an object needs at least one to be seen, per ray type (in static storage,
/// so that a query does not build the table on its stack).
inline constexpr uint32_t kRayTypeRequiredFlags[kRayTypeCount] = {
    kFlagPrimaryVisibility,        // primary
    kFlagVisibleInReflections,     // reflection
    kFlagVisibleInRefractions,     // refraction
    kFlagCastShadows,              // shadow
    kFlagCastGI | kFlagReceiveGI,  // photon
    kFlagVisibleInFG,              // final gather
    kFlagVisibleInReflections,     // glossy reflection
    0u,                            // environment: sees nothing
    kFlagCastOcclusion,            // occlusion
    kFlagEnvelop,                  // envelope
    kFlagIsImagePlane,             // image plane
};

/// Flag bits of which an object needs at least one to be seen by a ray type (0 = sees nothing).
constexpr uint32_t rayTypeRequiredFlags(int type) {
    return type >= 0 && type < kRayTypeCount ? kRayTypeRequiredFlags[type] : 0u;
}

/// Statistics name of a ray type; "Unknown" for any other index.
const char *rayTypeName(int type);

/// A ray with its type, time within the shutter interval and differentials.
struct Ray {
    Vec3 origin;
    Vec3 direction;  ///< Unit length for camera rays; any non-zero length is traced.
    uint8_t type = kRayPrimary;
    float time = 0.0f;  ///< Shutter time in [0, 1] (clamped by the tracer).
    Vec3 dOdx, dOdy;    ///< Change of origin per unit image x and y.
    Vec3 dDdx, dDdy;    ///< Change of direction per unit image x and y.
};

/// Instance index of a hit on geometry that belongs to no scene instance.
constexpr uint32_t kNoInstance = 0xFFFFFFFFu;

/// Result of a closest-hit query.
struct Hit {
    float t = -1.0f;           ///< Distance along the ray in units of its direction; -1 = no hit.
    float u = 0.0f, v = 0.0f;  ///< Barycentrics: point = (1 - u - v) p0 + u p1 + v p2.
    float w = 0.0f;            ///< Extra coordinate of non-triangle primitives (0 for triangles).
    uint32_t id = 0;           ///< Primitive identifier: the triangle's index inside its shape.
    uint32_t instance = kNoInstance;  ///< Index of the scene instance hit.
    uint32_t flags = 0;               ///< Flag word of the object hit.
    /// The primitive hit: an IntersectTriangle, or a MotionTriangle when moving is set.
    const void *primitive = nullptr;
    bool moving = false;  ///< True when the hit lies on a moving (motion-blurred) triangle.

    bool found() const { return t >= 0.0f; }
};

/// Per-thread count of traced rays by ray type (slot kRayTypeCount collects unknown types).
struct RayCounter {
    uint64_t counts[kRayTypeCount + 1] = {};

    void add(int type) { ++counts[type >= 0 && type < kRayTypeCount ? type : kRayTypeCount]; }
    uint64_t count(int type) const {
        return counts[type >= 0 && type < kRayTypeCount ? type : kRayTypeCount];
    }
    uint64_t total() const {
        uint64_t s = 0;
        for (uint64_t c : counts) s += c;
        return s;
    }
    void merge(const RayCounter &o) {
        for (int i = 0; i <= kRayTypeCount; ++i) counts[i] += o.counts[i];
    }
};

}  // namespace ox
