#include "app/settings_adapters.h"

namespace ox {

EnvironmentValues environmentValues(const EnvironmentSettingsBase &e) {
    EnvironmentValues v;
    v.rtEnvironment = e.rtEnvironment.value();
    v.rtEnvironmentIntensity = e.rtEnvironmentIntensity();
    v.giEnvironment = e.giEnvironment.value();
    v.giEnvironmentIntensity = e.giEnvironmentIntensity();
    v.globalAmbientColor = e.globalAmbientColor();
    v.skyLightColor = e.skyLightColor();
    v.iblSamples = e.iblSamples();
    v.iblImageFile = e.iblImageFile();
    v.iblIntensity = e.iblIntensity();
    v.iblBandingVsNoise = e.iblBandingVsNoise();
    v.iblTurnDome = e.iblTurnDome();
    v.iblSpecularBoost = e.iblSpecularBoost();
    v.iblSwapYZ = e.iblSwapYZ();
    v.iblEmitLight = e.iblEmitLight();
    v.iblEmitDiffuse = e.iblEmitDiffuse();
    v.iblEmitSpecular = e.iblEmitSpecular();
    v.iblShadows = e.iblShadows();
    v.iblEmitPhotons = e.iblEmitPhotons();
    v.iblCausticsPhotons = e.iblCausticsPhotons();
    v.iblGlobalPhotons = e.iblGlobalPhotons();
    v.iblPhotonEnergy = e.iblPhotonEnergy();
    v.iblGIEnvBlur = e.iblGIEnvBlur();
    return v;
}

SceneLoadSettings sceneLoadSettings(const OXConfigBase &config, int threadCount) {
    const RenderSettingsBase &render = config.RenderSettings;
    SceneLoadSettings s;
    s.mesh.mergeThreshold = render.vertexMergeThreshold();
    s.mesh.tangentSpace.oddUVFlipping = render.tsOddUVFlipping();
    s.mesh.tangentSpace.orthogonalize = render.tsVertexOrthogonalization();
    s.mesh.tangentSpace.normalize = render.tsVertexNormalization();
    s.bias = render.bias();
    s.threadCount = threadCount > 0 ? threadCount : 1;
    s.jobKind = config.FrameSettings.renderType.value();
    s.environment = environmentValues(config.EnvironmentSettings);
    return s;
}

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
