#pragma once

#include <string>
#include <vector>

#include "config/ox_config.h"
#include "scene/loader.h"

namespace ox {

/// The environment settings as the environment shaders take them.
EnvironmentValues environmentValues(const EnvironmentSettingsBase &environment);

/// The load settings of a run's configuration: welding and tangent frames from the render
/// settings, the bias, the job kind from the frame settings and the environment settings; threadCount is the size of the work server (at least 1).
SceneLoadSettings sceneLoadSettings(const OXConfigBase &config, int threadCount);

/// Loads a scene as a run does: the settings of the configuration, the loader, and the
/// automatic bias written back into the render settings when they ask for one (bias 0).
bool loadScene(const std::vector<std::string> &inputs, OXConfigBase &config, int threadCount,
               Scene &scene, std::string &error);

}  // namespace ox
