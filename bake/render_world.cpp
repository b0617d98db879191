#include "bake/render_world.h"

#include "config/settings_render.h"
#include "raytrace/instance.h"
#include "scene/scene.h"
#include "scene/shading_setup.h"

namespace ox {

RenderWorld::RenderWorld() = default;
RenderWorld::~RenderWorld() = default;

bool RenderWorld::build(const Scene &scene, const ADSParameters &ads,
                        const RenderSettingsBase &render) {
    std::vector<InstanceInput> inputs;
    inputs.reserve(scene.instances().size());
    for (uint32_t i = 0; i < scene.instances().size(); ++i)
        inputs.push_back(instanceInput(*scene.instances()[i], i));
    ownGrid_ = std::make_unique<CompleteGrid>();
    if (!ownGrid_->build(inputs, ads)) return false;
    build(scene, *ownGrid_, render);
    return true;
}

void RenderWorld::build(const Scene &scene, const CompleteGrid &grid,
                        const RenderSettingsBase &render) {
    scene_ = &scene;
    grid_ = &grid;
    ShadingSettings s;
    s.maxRayDepth = render.maxRayDepth();
    s.reflectionDepth = render.reflectionDepth();
    s.refractionDepth = render.refractionDepth();
    s.transparencyDepth = render.transparencyDepth();
    s.giTransparencyDepth = render.giTransparencyDepth();
    s.shadowDepth = render.shadowDepth();
    s.reflectionThreshold = render.reflectionThreshold();
    s.refractionThreshold = render.refractionThreshold();
    s.ignoreLightLinks = render.ignoreLightLinks();
    shading_ = std::make_unique<SceneShading>(scene, &grid, s, render.minShadowRays(),
                                              render.maxShadowRays());
}

const ShadingScene &RenderWorld::shading() const { return shading_->scene(); }

}  // namespace ox
