#pragma once

#include <cstdint>

#include "bake/bake_target.h"
#include "bake/uv_mesh_search.h"
#include "core/types.h"

/// The surface point of a bake sample: what the mesh search found, turned into world-space
/// geometry for shading, and the rules that choose the baked side of the surface.
namespace ox {

/// World-space surface under a bake sample.
struct BakeSurface {
    static constexpr int kMaxUvSets = 8;

    Vec3 position;
    Vec3 geometricNormal{0, 0, 1};  ///< unit, the side the triangle's winding names as front
    Vec3 normal{0, 0, 1};           ///< unit shading normal, on the same side
    Vec3 tangent{1, 0, 0}, bitangent{0, 1, 0};
    Vec2 uv[kMaxUvSets];
    uint32_t uvSetCount = 0;
    Color color;  ///< vertex colour ((0, 0, 0, 0) without colours)
    bool hasColor = false;
    const Instance *instance = nullptr;
    uint32_t instanceIndex = 0;
    uint32_t triangle = 0;
    bool flipped = false;  ///< the back of the surface is baked (normals negated)
};

/// Fills surface for barycentrics (b1, b2) of triangle of shape. The barycentrics may lie
/// outside the triangle: the position then continues the triangle's plane and the normals
/// continue their interpolation (renormalised), as the bilinear filter's resampling needs.
/// tangentUvSet is the UV set whose tangent frame shading gets (-1: the bake's UV set).
void fillBakeSurface(const ResolvedBakeShape &shape, uint32_t triangle, float b1, float b2,
                     int32_t tangentUvSet, BakeSurface &surface);

/// Pulls barycentrics (b1, b2) of a triangle with texel-space corners c away from its edges:
/// the point ends at least bias texels from every edge, or at the centroid when the
/// triangle is too thin for that. bias <= 0 leaves them unchanged.
void applyEdgeBias(const Vec2 c[3], float bias, float &b1, float &b2);

/// Applies the baked side (a NormalDirectionType value) with eye as the viewer. Returns false
/// when viewDependent is set and the surface turns away from the eye (the sample is
/// background).
bool applyNormalDirection(BakeSurface &surface, int32_t normalDirection, bool viewDependent,
                          const Vec3 &eye);

}  // namespace ox
