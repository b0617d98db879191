#include "app/scene_run_factory.h"

#include "app/command_line.h"
#include "app/settings_adapters.h"
#include "bake/camera_render.h"
#include "bake/render_world.h"
#include "bake/texture_bake_run.h"
#include "core/message.h"
#include "raytrace/complete_grid.h"
#include "raytrace/motion_blur.h"
#include "scene/load_settings.h"
#include "scene/scene.h"

namespace ox {

SceneRunFactory::SceneRunFactory() = default;
SceneRunFactory::~SceneRunFactory() = default;

bool SceneRunFactory::supports(int32_t action) const {
    return action == kActionRender || action == kActionTextureBake;
}

bool SceneRunFactory::loadScene(const std::vector<std::string> &inputs, OXConfig &config,
                                int64_t threads, std::string &error) {
    scene_ = std::make_unique<Scene>();
    world_.reset();
    grid_.reset();
    if (!ox::loadScene(inputs, config, int(std::clamp<int64_t>(threads, 1, 1024)), *scene_, error))
        return false;
    std::vector<InstanceInput> instances;
    instances.reserve(scene_->instances().size());
    for (size_t i = 0; i < scene_->instances().size(); ++i)
        instances.push_back(instanceInput(*scene_->instances()[i], uint32_t(i)));
    const MotionBlurHandler motion = motionBlurHandler(config.RenderSettings);
    grid_ = std::make_unique<CompleteGrid>();
    if (!grid_->build(instances, adsParameters(config.ADSSettings), &motion)) {
        error = "Unable to build the acceleration structure of the scene";
        return false;
    }
    return true;
}

bool SceneRunFactory::packUVs(OXConfig &, bool &changed, std::string &error) {
    changed = false;
    error = "UV packing is not available in this build.";
    return false;
}

std::unique_ptr<HLRenderInterface> SceneRunFactory::createRun(int32_t action,
                                                              const OXConfig &config,
                                                              int64_t threads) {
    if (!supports(action) || !scene_ || !grid_) {
        message(kMsgError, 6, "The %s is not available: this build has no driver for it.",
                describeAction(action).c_str());
        return nullptr;
    }
    if (action == kActionTextureBake) {
        world_ = std::make_unique<RenderWorld>();
        world_->build(*scene_, *grid_, config.RenderSettings);
        auto run = std::make_unique<TextureBakeRun>(*world_, config,
                                                    int32_t(std::clamp<int64_t>(threads, 1, 1024)));
        writer_.setRun(run.get());
        return run;
    }
    writer_.setRun(nullptr);
    return std::make_unique<CameraRender>(*scene_, *grid_, config, threads);
}

}  // namespace ox
