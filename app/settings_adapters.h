#pragma once

#include "config/ox_config.h"
#include "raytrace/complete_grid.h"
#include "raytrace/motion_blur.h"
#include "scene/load_settings.h"
#include "shading/environment.h"

/// The plain records that the tracer takes, filled from the configuration (the scene's own
/// come from scene/load_settings.h).
namespace ox {

/// The acceleration grid's parameters of the ADS settings.
ADSParameters adsParameters(const ADSSettingsBase &ads);

/// The motion-blur handler of the render settings (mode, steps, shutter interval).
MotionBlurHandler motionBlurHandler(const RenderSettingsBase &render);

}  // namespace ox
