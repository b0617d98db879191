#include "app/settings_adapters.h"

namespace ox {

ADSParameters adsParameters(const ADSSettingsBase &ads) {
    ADSParameters p;
    p.gridMaxDepth = ads.gridMaxDepth();
    p.gridThreshold = ads.gridThreshold();
    p.gridDensity = ads.gridDensity();
    p.useSSE = ads.useSSE();
    p.useInstancing = ads.useInstancing.value();
    p.instancingThreshold = ads.instancingThreshold();
    return p;
}

MotionBlurHandler motionBlurHandler(const RenderSettingsBase &render) {
    return MotionBlurHandler(render.motionBlur.value(), render.motionSteps(), render.shutterOpen(),
                             render.shutterClose());
}

}  // namespace ox
