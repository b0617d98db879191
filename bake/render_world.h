#pragma once

#include <cstdint>
#include <memory>

#include "raytrace/complete_grid.h"
#include "shading/shading_context.h"

/// The ray-traced world of a loaded scene: its acceleration structure and the read-only
/// shading scene every render thread shares.
namespace ox {

class RenderSettingsBase;
class Scene;
class SceneShading;

/// Built once per run after the scene is loaded; read-only while rendering.
class RenderWorld {
public:
    RenderWorld();
    ~RenderWorld();

    /// Builds the structure over every instance of scene, then the shading scene as below.
    /// False after one error message.
    bool build(const Scene &scene, const ADSParameters &ads, const RenderSettingsBase &render);
    /// The shading scene of scene's lights, light links and environments with the depths,
    /// thresholds and shadow-ray bounds of the render settings, over grid (built over scene's
    /// instances; it outlives the world).
    void build(const Scene &scene, const CompleteGrid &grid, const RenderSettingsBase &render);

    const Scene &scene() const { return *scene_; }
    const CompleteGrid &grid() const { return *grid_; }
    const ShadingScene &shading() const;
    /// The scene box (empty for an empty scene).
    BBox bounds() const { return grid_ ? grid_->bounds() : BBox{}; }

private:
    const Scene *scene_ = nullptr;
    std::unique_ptr<CompleteGrid> ownGrid_;
    const CompleteGrid *grid_ = nullptr;
    std::unique_ptr<SceneShading> shading_;
};

}  // namespace ox
