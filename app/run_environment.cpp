#include "app/camera_bake_driver.h"
#include "app/config_run_settings.h"
#include "app/run.h"
#include "app/scene_run_factory.h"
#include "config/input_list.h"
#include "platform/system.h"

namespace ox {

RunEnvironment defaultRunEnvironment() {
    RunEnvironment env;
    // The configuration, the input-list reader and the drivers plug in here as they arrive.
    env.makeSettings = [] { return std::make_unique<ConfigRunSettings>(); };
    env.loadInputList = loadInputList;
    env.processorCount = [] { return processorCount(); };
    env.drivers.set(kActionSplitConfig, std::make_shared<SplitDriver>());
    auto cameraBake = std::make_shared<CameraBakeDriver>(std::make_shared<SceneRunFactory>());
    for (int32_t action : {kActionRender, kActionTextureBake, kActionSurfaceTransfer})
        env.drivers.set(action, cameraBake);
    return env;
}

}  // namespace ox
