#pragma once

#include "core/types.h"
#include "shading/shading_context.h"

/// Secondary rays: tracing from a shading point into the scene and the colour of rays that
/// leave it.
namespace ox {

/// The environment's colour for the context's ray (GI rays see the GI environment, all others
/// the ray-traced one), times its colour weight; black without an environment.
Color environmentColor(const ShadingContext &ctx);

/// Traces a secondary ray described by child (its ray fields, type, depths, weight and mask
/// set; the surface fields are filled from the hit) from origin along unit direction, and
/// shades what it meets with the full material. Hits without a material are black; a miss
/// sees the environment. Without an acceleration structure or hit resolver only the
/// environment is seen.
Color traceSecondary(ShadingContext &child, const Vec3 &origin, const Vec3 &direction);

/// Reflects the unit direction d about the unit normal n.
inline Vec3 reflect(const Vec3 &d, const Vec3 &n) { return d - n * (2.0f * dot(d, n)); }

}  // namespace ox
