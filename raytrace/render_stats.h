#pragma once

#include <cstdint>

#include "raytrace/ray.h"

namespace ox {

/// The flag word of scene instances: the RenderStatsFlag bits (raytrace/ray.h) built from the
/// scene's RenderStats booleans.
struct RenderStats {
    /// The flag word of an instance whose RenderStats element keeps all defaults.
    static constexpr uint32_t kDefault =
        kFlagPrimaryVisibility | kFlagCastShadows | kFlagReceiveShadows | kFlagSelfOcclusion |
        kFlagMotionBlur | kFlagSmoothShading | kFlagVisibleInReflections |
        kFlagVisibleInRefractions | kFlagVisibleInFG | kFlagDoubleSided | kFlagCastGI |
        kFlagReceiveGI | kFlagSmoothGI | kFlagCastOcclusion | kFlagReceiveOcclusion;
};

}  // namespace ox
