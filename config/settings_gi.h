#pragma once

#include <cstdint>
#include <string>

#include "config/type.h"
#include "core/types.h"

/// Global illumination settings: integrators, final gather, photon maps, path tracer cache, Monte
/// Carlo; ambient occlusion.
namespace ox {

/// Enumeration "LightIntegratorType".
enum class LightIntegratorType : int32_t {
    None,
    GlobalPhotonMap,
    DynamicPhotonMap,
    PathTracer,
    FinalGather,
    MonteCarlo
};
OX_ENUM_NAMES(LightIntegratorType, "LightIntegratorType", "None", "GlobalPhotonMap",
              "DynamicPhotonMap", "PathTracer", "FinalGather", "MonteCarlo");

/// Enumeration "ClampMaterials".
enum class ClampMaterials : int32_t { None, Component, Intensity };
OX_ENUM_NAMES(ClampMaterials, "ClampMaterials", "None", "Component", "Intensity");

/// Enumeration "UseMapFileMode".
enum class UseMapFileMode : int32_t { Off, Overwrite, Reuse, ReuseAndAppend, PrecalcForAnimation };
OX_ENUM_NAMES(UseMapFileMode, "UseMapFileMode", "Off", "Overwrite", "Reuse", "ReuseAndAppend",
              "PrecalcForAnimation");

/// Enumeration "PhotonMapType".
enum class PhotonMapType : int32_t { Grid, Standard };
OX_ENUM_NAMES(PhotonMapType, "PhotonMapType", "Grid", "Standard");

/// Enumeration "FinalGatherCacheType".
enum class FinalGatherCacheType : int32_t { Off, Irradiance, RadianceSH };
OX_ENUM_NAMES(FinalGatherCacheType, "FinalGatherCacheType", "Off", "Irradiance", "RadianceSH");

/// Enumeration "PathTracerFilterType".
enum class PathTracerFilterType : int32_t { None, Box, Triangle, Gauss };
OX_ENUM_NAMES(PathTracerFilterType, "PathTracerFilterType", "None", "Box", "Triangle", "Gauss");

/// Enumeration "SelfOcclusionMode".
enum class SelfOcclusionMode : int32_t { Disabled, Environment, Enabled };
OX_ENUM_NAMES(SelfOcclusionMode, "SelfOcclusionMode", "Disabled", "Environment", "Enabled");

/// GI settings, 111 keys (type "GISettings").
class GISettingsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    GISettingsBase();

    OXCType<bool> enableGI{this, "enableGI", false, "Enables use of GI in the rendering"};
    OXCType<bool> enableCaustics{this, "enableCaustics", false,
                                 "Enables the use of caustics in the rendering"};
    OXCEnum<LightIntegratorType> primaryIntegrator{
        this, "primaryIntegrator", LightIntegratorType::FinalGather,
        "What GI solution to use as primary GI contribution"};
    OXCEnum<LightIntegratorType> secondaryIntegrator{
        this, "secondaryIntegrator", LightIntegratorType::PathTracer,
        "What GI solution to use as secondary GI contribution"};
    OXCType<int32_t> eyeRayIntegrator{
        this, "eyeRayIntegrator", 0,
        "Set what GI solution to use for eye rays, 0 for primary, 1 for secondary"};
    OXCType<int32_t> refrRayIntegrator{
        this, "refrRayIntegrator", 0,
        "Set what GI solution to use for refraction rays, 0 for primary, 1 for secondary"};
    OXCType<int32_t> reflRayIntegrator{
        this, "reflRayIntegrator", 0,
        "Set what GI solution to use for reflection rays, 0 for primary, 1 for secondary"};
    OXCType<int32_t> glossyRayIntegrator{
        this, "glossyRayIntegrator", 0,
        "Set what GI solution to use for glossy rays, 0 for primary, 1 for secondary"};
    OXCType<float> frame{this, "frame", 1.0f, nullptr};
    OXCType<bool> renderGIPrepassOnly{
        this, "renderGIPrepassOnly", false,
        "Render only prepasses of GI. Useful if you only want to generate GI map files."};
    OXCType<int32_t> prepassMinSampleRate{
        this, "prepassMinSampleRate", -4,
        "Sets the initial sample rate during the progressive GI pre-pass."};
    OXCType<int32_t> prepassMaxSampleRate{
        this, "prepassMaxSampleRate", 0,
        "Sets the maximum sample rate during the progressive GI pre-pass."};
    OXCType<bool> ignoreNonDiffuse{this, "ignoreNonDiffuse", true,
                                   "If this is true, materials that are non diffuse won't get GI"};
    OXCType<float> primaryIntensity{this, "primaryIntensity", 1.0f,
                                    "Intensity of the primary GI contribution"};
    OXCType<float> primarySaturation{this, "primarySaturation", 1.0f,
                                     "Saturation of the primary GI contribution"};
    OXCType<float> secondaryIntensity{this, "secondaryIntensity", 1.0f,
                                      "Intensity of the secondary GI contribution"};
    OXCType<float> secondarySaturation{this, "secondarySaturation", 1.0f,
                                       "Saturation of the secondary GI contribution"};
    OXCType<float> causticsIntensity{this, "causticsIntensity", 1.0f,
                                     "Intensity of the caustics contribution"};
    OXCType<float> causticsSaturation{this, "causticsSaturation", 1.0f,
                                      "Saturation of the caustics contribution"};
    OXCType<float> diffuseBoost{
        this, "diffuseBoost", 1.0f,
        "Boosts the diffuse color for all materials for GI purposes. A value larger than 1 will "
        "make light bounces off other surfaces stronger."};
    OXCType<float> specularScale{this, "specularScale", 1.0f,
                                 "Global scale for specular materials"};
    OXCType<float> emissiveScale{this, "emissiveScale", 1.0f,
                                 "Global scale for emissive materials"};
    OXCEnum<ClampMaterials> clampMaterials{
        this, "clampMaterials", ClampMaterials::None,
        "Clamping of material colors for GI, None, Component (clamps each component) or Intensity "
        "(keeps the hue and clamps the intensity)"};
    OXCType<float> causticsPhotonMapAccuracy{this, "causticsPhotonMapAccuracy", 1.0f, nullptr};
    OXCType<int32_t> causticsPhotonMapPhotons{
        this, "causticsPhotonMapPhotons", 100,
        "The maximum number of photons to consider for caustics."};
    OXCType<float> causticsPhotonMapRadius{this, "causticsPhotonMapRadius", 0.0f,
                                           "The maximum search radius to consider for caustics."};
    OXCType<float> causticsPhotonMapFilterKernel{this, "causticsPhotonMapFilterKernel", 1.0f,
                                                 "Size of filter kernel for caustics map."};
    OXCEnum<UseMapFileMode> causticsPhotonMapUseFile{this, "causticsPhotonMapUseFile",
                                                     UseMapFileMode::Off, nullptr};
    OXCType<std::string> causticsPhotonMapFile{this, "causticsPhotonMapFile", "",
                                               "Name of the caustics photons file."};
    OXCType<bool> causticsPhotonMapVisualize{this, "causticsPhotonMapVisualize", false, nullptr};
    OXCType<int32_t> causticsPhotonMapMaxDepth{this, "causticsPhotonMapMaxDepth", 5,
                                               "Maximum depth for caustics photons"};
    OXCEnum<PhotonMapType> globalPhotonMapAlgorithm{this, "globalPhotonMapAlgorithm",
                                                    PhotonMapType::Grid,
                                                    "Sets what photon map algorithm to use"};
    OXCType<float> globalPhotonMapAccuracy{
        this, "globalPhotonMapAccuracy", 1.0f,
        "Sets the maximum number of photons to include in a search"};
    OXCType<int32_t> globalPhotonMapPhotons{this, "globalPhotonMapPhotons", 300,
                                            "The maximum number of photons to consider for GI."};
    OXCType<float> globalPhotonMapRadius{this, "globalPhotonMapRadius", 0.0f,
                                         "The maximum search radius to consider for GI."};
    OXCEnum<UseMapFileMode> globalPhotonMapUseFile{this, "globalPhotonMapUseFile",
                                                   UseMapFileMode::Off,
                                                   "Sets how the GI photon map file is used"};
    OXCType<std::string> globalPhotonMapFile{this, "globalPhotonMapFile", "",
                                             "Name of the GI photons file."};
    OXCType<bool> globalPhotonMapVisualize{this, "globalPhotonMapVisualize", false, nullptr};
    OXCType<int32_t> globalPhotonMapMaxDepth{this, "globalPhotonMapMaxDepth", 5,
                                             "Maximum GI photon depth to store."};
    OXCType<int32_t> globalPhotonMapMinDepth{
        this, "globalPhotonMapMinDepth", 1,
        "Minimum GI photon depth to store. Only valid if globalPhotonMapOverrideMinDepth = true"};
    OXCType<bool> globalPhotonMapOverrideMinDepth{
        this, "globalPhotonMapOverrideMinDepth", false,
        "Sets whether the GI minimum photon depth should be derived or manually set."};
    OXCType<bool> globalPhotonMapPrecalcIrradiance{this, "globalPhotonMapPrecalcIrradiance", false,
                                                   "Enabling Precalculation of irradiance. Only "
                                                   "valid if globalPhotonMapAlgorithm = Standard."};
    OXCType<int32_t> globalPhotonMapPrecalcStep{
        this, "globalPhotonMapPrecalcStep", 4,
        "Number of precalculation steps. Only valid if globalPhotonMapPrecalcIrradiance = true"};
    OXCType<int32_t> globalPhotonMapGridCells{
        this, "globalPhotonMapGridCells", 100000,
        "Number of grid cells in the photon map. Only valid if globalPhotonMapAlgorithm = Grid."};
    OXCType<bool> globalPhotonMapCacheDirectLight{
        this, "globalPhotonMapCacheDirectLight", true,
        "If enabled the photon map will include direct lighting (only valid when used as secondary "
        "GI)."};
    OXCType<Vec3> dynamicPhotonMapPreviewLightDirection{
        this, "dynamicPhotonMapPreviewLightDirection", Vec3{1.0f, 1.0f, 1.0f}, nullptr};
    OXCType<int32_t> dynamicPhotonMapTotalPhotons{this, "dynamicPhotonMapTotalPhotons", 400000,
                                                  nullptr};
    OXCType<float> dynamicPhotonMapAccuracy{this, "dynamicPhotonMapAccuracy", 1.0f, nullptr};
    OXCType<int32_t> dynamicPhotonMapPhotons{this, "dynamicPhotonMapPhotons", 300, nullptr};
    OXCType<float> dynamicPhotonMapRadius{this, "dynamicPhotonMapRadius", 0.0f, nullptr};
    OXCEnum<UseMapFileMode> dynamicPhotonMapUseFile{this, "dynamicPhotonMapUseFile",
                                                    UseMapFileMode::Off, nullptr};
    OXCType<std::string> dynamicPhotonMapFile{this, "dynamicPhotonMapFile", "", nullptr};
    OXCType<int32_t> dynamicPhotonMapMaxDepth{this, "dynamicPhotonMapMaxDepth", 5, nullptr};
    OXCType<int32_t> dynamicPhotonMapMinDepth{this, "dynamicPhotonMapMinDepth", 0, nullptr};
    OXCType<int32_t> dynamicPhotonMapSHBands{this, "dynamicPhotonMapSHBands", 4, nullptr};
    OXCType<int32_t> dynamicPhotonMapSHGatherCells{this, "dynamicPhotonMapSHGatherCells", 100,
                                                   nullptr};
    OXCType<int32_t> dynamicPhotonMapGridCells{this, "dynamicPhotonMapGridCells", 100000, nullptr};
    OXCEnum<FinalGatherCacheType> fgUseCache{this, "fgUseCache", FinalGatherCacheType::Irradiance,
                                             "Sets what kind of final gather to use, Valid options "
                                             "Off, Irradiance Cache, Radiance Cache"};
    OXCType<int32_t> fgRays{this, "fgRays", 300, "Number of gather rays per FG point"};
    OXCType<int32_t> fgDepth{this, "fgDepth", 1, "Number of indirect light bounces"};
    OXCType<bool> fgPreview{this, "fgPreview", true, nullptr};
    OXCType<bool> fgUseLegacy{this, "fgUseLegacy", false, "Set this to enable the old GI settings"};
    OXCType<int32_t> fgInterpolationPoints{
        this, "fgInterpolationPoints", 15,
        "The number of sample points used for each interpolation"};
    OXCType<float> fgContrastThreshold{
        this, "fgContrastThreshold", 0.1f,
        "The maximum allowed difference in color between points used for interpolation"};
    OXCType<float> fgEstimatePoints{
        this, "fgEstimatePoints", 15.0f,
        "The number of sample points used for each estimate during the calculation pass"};
    OXCType<float> fgNormalThreshold{
        this, "fgNormalThreshold", 0.2f,
        "Controls the maximum allowed normal deviation between points used for interpolation"};
    OXCType<float> fgGradientThreshold{
        this, "fgGradientThreshold", 0.5f,
        "Controls how the irradiance translation gradient is used in the interpolation"};
    OXCType<bool> fgCheckVisibility{this, "fgCheckVisibility", false,
                                    "Rejects samples not visible from the interpolation points, "
                                    "which helps to reduce light leakage"};
    OXCType<int32_t> fgCheckVisibilityDepth{
        this, "fgCheckVisibilityDepth", 1,
        "Controls for how many bounces the visibility checks should be performed."};
    OXCType<float> fgAccuracy{
        this, "fgAccuracy", 1.0f,
        "Legacy Setting. Sets how accurate the irradiance cache is when it creates new points"};
    OXCType<float> fgSmooth{this, "fgSmooth", 1.0f,
                            "Legacy Setting. Scales the search radius in the irradiance cache. "
                            "Gives less noise and details in the indirect light"};
    OXCType<bool> fgDisableMinRadius{
        this, "fgDisableMinRadius", false,
        "Legacy Setting. Allows points in the irradiance cache to be very close together"};
    OXCEnum<UseMapFileMode> fgUseFile{this, "fgUseFile", UseMapFileMode::Off,
                                      "Sets how the final gather cache file is used"};
    OXCType<std::string> fgFile{this, "fgFile", "", "Name of the final gather cache file"};
    OXCType<bool> fgVisualize{this, "fgVisualize", false, nullptr};
    OXCType<float> fgMaxRayLength{this, "fgMaxRayLength", 0.0f, "Max search range for FG rays"};
    OXCType<bool> fgClampRadiance{this, "fgClampRadiance", false,
                                  "Toggles clamping of radiance for FG rays"};
    OXCType<bool> fgLightLeakReduction{
        this, "fgLightLeakReduction", false,
        "Enable a method for eliminating light leakage during interpolation"};
    OXCType<float> fgLightLeakRadius{
        this, "fgLightLeakRadius", 0.0f,
        "Sets the distance from the sample point where light leak reduction should be enabled"};
    OXCType<bool> fgExploitFrameCoherence{this, "fgExploitFrameCoherence", false,
                                          "Reuse final gather samples between frames"};
    OXCType<float> fgMaxMovement{this, "fgMaxMovement", 1e6f, nullptr};
    OXCType<bool> fgCacheDirectLight{this, "fgCacheDirectLight", false,
                                     "If enabled the final gather cache will include direct "
                                     "lighting (only on secondary depths)"};
    OXCType<float> fgAttenuationStart{this, "fgAttenuationStart", 0.0f,
                                      "Start distance of the final gather distance attenuation"};
    OXCType<float> fgAttenuationStop{this, "fgAttenuationStop", 0.0f,
                                     "Stop distance of the final gather distance attenuation"};
    OXCType<float> fgFalloffExponent{this, "fgFalloffExponent", 0.0f,
                                     "Exponent of the final gather distance attenuation"};
    OXCType<float> fgAOInfluence{
        this, "fgAOInfluence", 0.0f,
        "Sets how much AO should influence the lighting. If set to 0, AO is not used."};
    OXCType<float> fgAOScale{this, "fgAOScale", 1.0f, "Scaling of the occlusion values"};
    OXCType<float> fgAOMaxDistance{this, "fgAOMaxDistance", 0.0f,
                                   "Distance beyond which an occlusion ray counts as unoccluded"};
    OXCType<float> fgAOContrast{this, "fgAOContrast", 1.0f, "Contrast of the occlusion values"};
    OXCType<bool> fgAOVisualize{this, "fgAOVisualize", false,
                                "Visualize just the ambient occlusion values."};
    OXCType<bool> ptPreview{this, "ptPreview", true, "Enables preview of path tracing"};
    OXCType<float> ptAccuracy{
        this, "ptAccuracy", 1.0f,
        "Number of paths to trace for each baked sample (texel, vertex or point)"};
    OXCType<int32_t> ptDepth{this, "ptDepth", 5, "Average number of light bounces"};
    OXCType<float> ptPointSize{this, "ptPointSize", 0.0f,
                               "Maximum size for a point in the path tracer cache"};
    OXCType<float> ptNormalThreshold{
        this, "ptNormalThreshold", 0.707f,
        "Controls the maximum allowed normal deviation accepted when using the path tracer cache"};
    OXCType<bool> ptCheckVisibility{this, "ptCheckVisibility", false,
                                    "Rejects points not visible from the intersection point, which "
                                    "helps to reduce light leakage"};
    OXCEnum<UseMapFileMode> ptUseFile{this, "ptUseFile", UseMapFileMode::Off,
                                      "Sets how writing of path tracer points to a file works"};
    OXCType<std::string> ptFile{this, "ptFile", "", "The files to save path tracer points"};
    OXCType<bool> ptVisualize{this, "ptVisualize", false, "Visualize the path tracer cache"};
    OXCEnum<PathTracerFilterType> ptFilterType{this, "ptFilterType", PathTracerFilterType::Box,
                                               "What filter type to use for path tracer lookups"};
    OXCType<float> ptFilterSize{this, "ptFilterSize", 3.0f,
                                "The filter size for the path tracer search. 0 means autosize"};
    OXCType<bool> ptDiffuseIllum{this, "ptDiffuseIllum", true,
                                 "Enables diffuse bounces in the scene"};
    OXCType<bool> ptSpecularIllum{this, "ptSpecularIllum", true,
                                  "Enables specular bounces in the scene"};
    OXCType<bool> ptTransmissiveIllum{this, "ptTransmissiveIllum", true,
                                      "Enables transmissive bounces in the scene"};
    OXCType<RGBf> ptDefaultColor{
        this, "ptDefaultColor", RGBf{0.0f, 0.0f, 0.0f},
        "Color to use for areas where no path tracer rays have reached. Set to a easily identified "
        "color to detect areas where light doesn't reach"};
    OXCType<bool> ptCacheDirectLight{this, "ptCacheDirectLight", true,
                                     "If enabled the path tracer will include direct lighting in "
                                     "it's cache (only valid when used as secondary GI)."};
    OXCType<float> ptConservativeEnergyLimit{this, "ptConservativeEnergyLimit", 0.95f,
                                             "Set how much energy may be transmitted in a shading "
                                             "point. The emissive contribution is not included."};
    OXCType<bool> ptPrecalcIrradiance{
        this, "ptPrecalcIrradiance", true,
        "Enabling Precalculation of irradiance to speed up look-up of the Path Tracer cache."};
    OXCType<int32_t> mcRays{this, "mcRays", 16, "Number of rays per shading point"};
    OXCType<int32_t> mcDepth{this, "mcDepth", 2, nullptr};
    OXCType<float> mcMaxRayLength{this, "mcMaxRayLength", 0.0f, "Max search range for the rays"};
};

/// Ambient occlusion settings (type "AOSettings").
class AOSettingsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    AOSettingsBase();

    OXCType<bool> aoUniformSampling{this, "aoUniformSampling", false,
                                    "Sets whether uniform sampling should be used. If disabled "
                                    "cosine weighted sampling is used."};
    OXCType<bool> aoBendNormals{
        this, "aoBendNormals", false,
        "Sets whether bent normals should be generated. Only valid if aoAdaptive = false."};
    OXCType<bool> aoReflectionOcclusion{
        this, "aoReflectionOcclusion", false,
        "Sets if reflective occlusion should be calculated. Only valid if aoAdaptive = false."};
    OXCType<bool> aoUseDisplacement{this, "aoUseDisplacement", false,
                                    "Sets whether the AO should consider displacement."};
    OXCType<bool> aoObeyTransparency{this, "aoObeyTransparency", false,
                                     "Sets whether the AO should consider transparency."};
    OXCType<int32_t> aoMinRay{this, "aoMinRay", 64,
                              "Sets the minimum number of rays for AO sampling."};
    OXCType<int32_t> aoMaxRay{this, "aoMaxRay", 256,
                              "Sets the maximum number of rays for AO sampling."};
    OXCType<float> aoConeAngle{this, "aoConeAngle", 180.0f,
                               "Sets the cone angle in which AO is sampled."};
    OXCType<float> aoMaxDistance{
        this, "aoMaxDistance", 0.0f,
        "Sets the max occlusion distance. Beyond this distance there is full visibility. Hence it "
        "also controls the maximum distance an occlusion ray is traced."};
    OXCType<float> aoContrast{this, "aoContrast", 1.0f,
                              "Can be used to adjust the contrast for ambient occlusion"};
    OXCType<float> aoScale{this, "aoScale", 1.0f,
                           "Scaling of the occlusion values. Can be used to increase or decrease "
                           "the shadowing effect."};
    OXCEnum<SelfOcclusionMode> aoSelfOcclusion{this, "aoSelfOcclusion", SelfOcclusionMode::Enabled,
                                               "Controls how self occlusion should be treated: "
                                               "0=Disabled, 1=Environment, 2=Enabled (Default)."};
    OXCType<bool> aoAdaptive{this, "aoAdaptive", true, "Sets whether the AO should be adaptive."};
    OXCType<float> aoAccuracy{
        this, "aoAccuracy", 1.0f,
        "Sets the accuracy of the adaptive AO. Only valid if aoAdaptive = true."};
    OXCType<float> aoSmooth{
        this, "aoSmooth", 1.0f,
        "Sets the smoothness of the adaptive AO. Only valid if aoAdaptive = true."};
    OXCType<bool> aoUseFile{this, "aoUseFile", false,
                            "Sets whether the adaptive AO points are saved to a file"};
    OXCType<std::string> aoFile{this, "aoFile", "", "File name for the adaptive AO points"};
};

}  // namespace ox
