#pragma once

#include <cstdint>

#include "core/types.h"
#include "raytrace/ray.h"

/// The surface point: everything shading, lighting and baking read about the place a ray hit,
/// computed in one place from the hit record.
namespace ox {

class CompleteGrid;
class Instance;
class MaterialHandle;

/// One UV set at the surface point: the coordinates, their change per unit image x and y (from
/// the ray differentials) and the set's tangent frame (interpolated, in world space, unit length
/// or zero when the set has none).
struct SurfaceUv {
    Vec2 uv;
    Vec2 dUVdx, dUVdy;
    Vec3 tangent, bitangent;
};

/// A hit turned into what shading needs. Plain data: no allocation, copied freely.
///
/// Normals point to the front of the surface, the side its triangle's winding names as front
/// in object space ((p1 - p0) x (p2 - p0)), carried to world space as normals (by the inverse
/// transpose of the placement). A mirroring placement therefore keeps the object's outside
/// outside. `backSide` tells from which side the ray came; normals are never flipped towards the
/// ray here (shading decides that).
struct SurfacePoint {
    /// UV sets held in the point; a shape's further sets are read with surfaceUv.
    static constexpr int kMaxUvSets = 8;

    Vec3 position;         ///< World position on the triangle (not origin + t direction).
    Vec3 geometricNormal;  ///< Unit normal of the triangle's plane.
    /// Unit shading normal: the vertex normals interpolated with the barycentrics, or the
    /// geometric normal when the instance has no SmoothShading flag or they cancel out.
    Vec3 normal;
    /// Unit shading frame: UV set 0's tangent made orthogonal to `normal`, and its bitangent
    /// made orthogonal to both. The bitangent keeps the set's direction, so under a mirroring
    /// placement or mirrored UVs (tangent, bitangent, normal) is left-handed. Without a usable
    /// tangent, any frame around `normal`.
    Vec3 tangent, bitangent;
    Vec3 dPdx, dPdy;  ///< Change of position per unit image x and y (zero without differentials).
    float u = 0.0f, v = 0.0f;                                  ///< The hit's barycentrics.
    float dudx = 0.0f, dvdx = 0.0f, dudy = 0.0f, dvdy = 0.0f;  ///< Their change per image unit.
    Color color;  ///< Interpolated vertex colour; (0, 0, 0, 0) without colours.
    SurfaceUv uvs[kMaxUvSets];
    uint32_t uvSetCount = 0;  ///< Sets filled in uvs: min(the shape's sets, kMaxUvSets).
    /// The triangle's material as the instance shows it (its override, else the shape's slot);
    /// null when there is none. The shading code turns it into its Material (materialOf).
    const MaterialHandle *material = nullptr;
    const Instance *instance = nullptr;  ///< The instance hit.
    uint32_t instanceIndex = kNoInstance;
    uint32_t flags = 0;        ///< The instance's RenderStats flag word.
    uint32_t triangle = 0;     ///< The triangle's index in its shape.
    uint32_t corners[3] = {};  ///< Its vertex indices in the shape's vertex list.
    bool backSide = false;     ///< The ray came from behind (direction . geometricNormal > 0).
    bool moving = false;       ///< The triangle moves (positions are taken at the ray's time).
};

/// Fills point for a hit of ray on instance (the scene instance whose index the hit names).
/// Moving hits read their corners at the ray's time from grid, the structure that reported the
/// hit; other hits do not need it. False, with point untouched, when the hit is not found, names
/// a triangle the instance's shape does not have, or is moving without a grid.
bool surfacePoint(const Ray &ray, const Hit &hit, const Instance &instance, SurfacePoint &point,
                  const CompleteGrid *grid = nullptr);

/// UV set k (any set of the shape, also beyond kMaxUvSets) at a point filled by surfacePoint.
/// A set the shape does not have reads as zero.
SurfaceUv surfaceUv(const SurfacePoint &point, uint32_t k);

}  // namespace ox
