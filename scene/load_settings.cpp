#include "scene/load_settings.h"

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
    SceneLoadSettings s;
    const RenderSettingsBase &r = config.RenderSettings;
    s.mesh.mergeThreshold = r.vertexMergeThreshold();
    s.mesh.tangentSpace.oddUVFlipping = r.tsOddUVFlipping();
    s.mesh.tangentSpace.orthogonalize = r.tsVertexOrthogonalization();
    s.mesh.tangentSpace.normalize = r.tsVertexNormalization();
    s.bias = r.bias();
    s.threadCount = threadCount > 0 ? threadCount : 1;
    s.jobKind = config.FrameSettings.renderType.value();
    s.environment = environmentValues(config.EnvironmentSettings);
    return s;
}

bool loadScene(const std::vector<std::string> &inputs, OXConfigBase &config, int threadCount,
               Scene &scene, std::string &error) {
    const SceneLoadSettings settings = sceneLoadSettings(config, threadCount);
    ZPXLoader loader;
    if (!loader.load(inputs, settings, scene, error)) return false;
    if (settings.bias == 0.0f) config.RenderSettings.bias = scene.bias();
    return true;
}

}  // namespace ox
