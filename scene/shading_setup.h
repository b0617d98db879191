#pragma once

#include <vector>

#include "scene/scene.h"
#include "shading/shading_context.h"

namespace ox {

class CompleteGrid;

/// The shading view of a loaded scene: a ShadingScene over its lights, light links,
/// instances and environments, and the pointer lists it points into. Made once per run after
/// the acceleration structure is built; read-only while rendering.
///
///     SceneShading shading(scene, &grid, settings);
///     ShadingContext ctx;                     // one per render thread
///     ctx.scene = &shading.scene();
class SceneShading {
public:
    /// For scene traced through grid (null: no secondary or shadow rays); the bias is the
    /// scene's, the depths, thresholds and shadow-ray bounds come from settings.
    SceneShading(const Scene &scene, const CompleteGrid *grid, const ShadingSettings &settings,
                 uint32_t minShadowRays = 0, uint32_t maxShadowRays = 0xFFFFFFFFu);
    SceneShading(const SceneShading &) = delete;
    SceneShading &operator=(const SceneShading &) = delete;

    const ShadingScene &scene() const { return scene_; }
    /// Sets the integrator of indirect light (null: none).
    void setIndirect(const IndirectLightInterface *indirect) { scene_.indirect = indirect; }

private:
    std::vector<const LightSource *> lights_;
    std::vector<const Instance *> instances_;
    ShadingScene scene_;
};

}  // namespace ox
