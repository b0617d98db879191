#include "scene/shading_setup.h"

#include "raytrace/complete_grid.h"

namespace ox {

SceneShading::SceneShading(const Scene &scene, const CompleteGrid *grid,
                           const ShadingSettings &settings, uint32_t minShadowRays,
                           uint32_t maxShadowRays) {
    for (const auto &l : scene.lights()) lights_.push_back(l.get());
    for (const auto &i : scene.instances()) instances_.push_back(i.get());
    scene_.settings = settings;
    scene_.setRayTracing(grid, scene.bias(), minShadowRays, maxShadowRays);
    scene_.grid = grid;
    scene_.lights = lights_.data();
    scene_.lightCount = uint32_t(lights_.size());
    scene_.instances = instances_.data();
    scene_.instanceCount = uint32_t(instances_.size());
    const LightLinkTable &links = scene.lightLinks();
    if (links.instanceCount() > 0 && links.lightCount() > 0) {
        scene_.lightLinks = links.row(0);
        scene_.lightLinkWords = (size_t(links.lightCount()) + 63) / 64;
        scene_.lightLinkInstances = links.instanceCount();
    }
    scene_.rtEnvironment = scene.environment().rtShader();
    scene_.giEnvironment = scene.environment().giShader();
}

}  // namespace ox
