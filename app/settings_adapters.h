#pragma once

#include "config/ox_config.h"
#include "raytrace/complete_grid.h"
#include "raytrace/motion_blur.h"
#include "scene/loader.h"
#include "shading/environment.h"

/// The plain records that the scene loader and the tracer take, filled from the configuration.
namespace ox {

/// The environment settings as the environment shaders take them.
EnvironmentValues environmentValues(const EnvironmentSettingsBase &environment);

/// What a scene load takes: welding and tangent frames and bias (RenderSettings), the job kind
/// (renderType), the environment; threadCount is the size of the work server.
SceneLoadSettings sceneLoadSettings(const OXConfigBase &config, int threadCount);

/// The acceleration grid's parameters of the ADS settings.
ADSParameters adsParameters(const ADSSettingsBase &ads);

/// The motion-blur handler of the render settings (mode, steps, shutter interval).
MotionBlurHandler motionBlurHandler(const RenderSettingsBase &render);

}  // namespace ox
