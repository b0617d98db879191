#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "config/settings_bake.h"
#include "core/types.h"

/// What a texture bake needs to know about its targets before any texel is baked: the pass
/// list, the checked target sizes, and each target's shapes with their UV set and UV matrix.
namespace ox {

class Instance;
class Scene;
class VertexList;

/// Largest bake target edge in texels.
constexpr int32_t kMaxBakeTargetEdge = 65535;

/// The passes the render components ask for, in bake order ("beauty" last); empty when none.
std::vector<std::string> bakePassList(const RenderComponentsBase &components);

/// The size of a target: its resolution override (or frameResolution) times resolutionScale,
/// truncated. Computed in 64 bits; the caller checks it with validBakeSize.
struct BakeTargetSize {
    int64_t width = 0, height = 0;
};
BakeTargetSize bakeTargetSize(const BakeTextureTargetBase &target, float resolutionScale,
                              const Vec2i &frameResolution);
/// True when both edges are in [1, kMaxBakeTargetEdge] (so the texel count fits easily).
bool validBakeSize(const BakeTargetSize &size);

/// Checks every target before anything is baked: sizes (the dimension message) and texture
/// names that would give the same files. False after the messages.
bool validateBakeTargets(const TextureBakeSettingsBase &settings, const Vec2i &frameResolution);

/// One bake shape of a target as the bake uses it.
struct ResolvedBakeShape {
    const Instance *instance = nullptr;
    uint32_t instanceIndex = 0;  ///< index in the scene's instance list (light links)
    int32_t uvSet = 0;           ///< the UV set the texels are laid out in
    Vec2 uvScale{1.0f, 1.0f};    ///< u' = u * scale.x + bias.x, v' = v * scale.y + bias.y
    Vec2 uvBias{0.0f, 0.0f};
    std::string name;  ///< the bake shape's own name (light passes), else the instance name
};

/// The UV set a light map uses when nothing names one: the set called "lightmap" (any case),
/// else the second set when there are two or more, else the first.
int32_t defaultLightMapUvSet(const VertexList &vertices);

/// The UV set name a bake shape asks for: its UVSetOverride when hasUVSetOverride is set, else
/// the settings' uvSet; empty when neither names one.
std::string bakeShapeUvSetName(const TextureBakeSettingsBase &settings, const BakeShapeBase &shape);

/// The UV set a bake shape's texels are laid out in: the named set (bakeShapeUvSetName), or the
/// default light-map set when none is named. -1 when the named set does not exist.
int32_t bakeShapeUvSet(const TextureBakeSettingsBase &settings, const BakeShapeBase &shape,
                       const VertexList &vertices);

/// Resolves the shapes of target: missing instances, unknown UV sets and non-invertible UV
/// matrices are reported and skipped. The result may be empty.
std::vector<ResolvedBakeShape> resolveBakeShapes(const TextureBakeSettingsBase &settings,
                                                 const BakeTextureTargetBase &target,
                                                 const Scene &scene);

/// The UV rectangle that fills the whole target: [0, 1]^2 (Default), the box of the shapes'
/// transformed UVs (Entire) or [uMin, uMax] x [vMin, vMax] (Specified). Null after an error
/// message when the rectangle has no area.
struct UvRect {
    float uMin = 0.0f, vMin = 0.0f, uMax = 1.0f, vMax = 1.0f;
};
std::optional<UvRect> bakeUvRect(const TextureBakeSettingsBase &settings,
                                 const std::vector<ResolvedBakeShape> &shapes,
                                 const std::string &targetName);

}  // namespace ox
