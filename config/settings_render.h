#pragma once

#include <cstdint>
#include <string>

#include "config/type.h"
#include "core/types.h"

/// Antialiasing, render (ray depths, thresholds, motion blur, tangent space) and environment
/// settings.
namespace ox {

/// Enumeration "SamplingType".
enum class SamplingType : int32_t { Adaptive = 1, SuperSampling = 2 };
OX_ENUM_VALUES(SamplingType, "SamplingType", {"Adaptive", 1}, {"SuperSampling", 2});

/// Enumeration "FilterType".
enum class FilterType : int32_t {
    Box,
    Triangle,
    Cubic,
    Gauss,
    CatmullRom,
    Lanczos,
    Mitchell,
    Tavik
};
OX_ENUM_NAMES(FilterType, "FilterType", "Box", "Triangle", "Cubic", "Gauss", "CatmullRom",
              "Lanczos", "Mitchell", "Tavik");

/// Enumeration "MotionBlurMode".
enum class MotionBlurMode : int32_t { Off, Blur2D, Blur3D };
OX_ENUM_NAMES(MotionBlurMode, "MotionBlurMode", "Off", "2D", "3D");

/// Enumeration "EnvironmentType".
enum class EnvironmentType : int32_t { None, Camera, SkyLight, IBL };
OX_ENUM_NAMES(EnvironmentType, "EnvironmentType", "None", "Camera", "SkyLight", "IBL");

/// Antialiasing settings (type "AASettings").
class AASettingsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    AASettingsBase();

    OXCEnum<SamplingType> samplingMode{this, "samplingMode", SamplingType::Adaptive,
                                       "The sampling strategy to use"};
    OXCType<int32_t> minSampleRate{this, "minSampleRate", -2,
                                   "Sets the minimum sample rate per pixel"};
    OXCType<int32_t> maxSampleRate{this, "maxSampleRate", 0,
                                   "Sets the maximum sample rate per pixel"};
    OXCType<float> contrast{
        this, "contrast", 0.1f,
        "Sets the maximum allowed contrast difference between neighboring samples"};
    OXCType<bool> edgeTracing{
        this, "edgeTracing", true,
        "Enable adaptive edge tracing. Only valid if samplingMode = SuperSampling"};
    OXCType<bool> diagnose{this, "diagnose", false, "Diagnose sampling density pattern"};
    OXCType<bool> hardEdges{
        this, "hardEdges", false,
        "When enabled pixels with background samples will not be anti-aliased. This is useful when "
        "texture baking to get correct edge dilation filtering"};
    OXCType<bool> clamp{this, "clamp", false, "Clamp values before comparing them"};
    OXCType<float> minValue{this, "minValue", 0.0f, "Minimum value used when clamping"};
    OXCType<float> maxValue{this, "maxValue", 1.0f, "Maximum value used when clamping"};
    OXCEnum<FilterType> filter{this, "filter", FilterType::Box, "The filter type to use"};
    OXCType<Vec2> filterSize{this, "filterSize", Vec2{1.0f, 1.0f}, "Filter kernel size"};
    OXCType<bool> motionBlur{this, "motionBlur", false, "Not relevant for Vorn"};
    OXCType<uint32_t> timeSamples{this, "timeSamples", 0u, "Not relevant for Vorn"};
    OXCType<uint32_t> dofSamples{this, "dofSamples", 0u, "Not relevant for Vorn"};
};

/// Render settings: ray depths, thresholds, motion blur, tangent space (type "RenderSettings").
class RenderSettingsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    RenderSettingsBase();

    OXCType<float> frame{this, "frame", 1.0f, "Frame (Vendrel)"};
    OXCType<float> fps{this, "fps", 24.0f, "Frames per second (Vendrel)"};
    OXCType<std::string> defaultEnvironment{this, "defaultEnvironment", "",
                                            "Default Environment Shader (Vendrel)"};
    OXCType<std::string> renderLayer{this, "renderLayer", "defaultRenderLayer",
                                     "Render layer to use (Vendrel)"};
    OXCType<bool> defaultLight{this, "defaultLight", true,
                               "Enable default light if no lights are present in the scene"};
    OXCType<bool> ignoreLightLinks{this, "ignoreLightLinks", false, "Ignore Light Links"};
    OXCType<bool> shadowsIgnoreLightLinks{
        this, "shadowsIgnoreLightLinks", false,
        "Makes objects act as occluders for lights which they are not light linked to"};
    OXCType<float> vertexMergeThreshold{
        this, "vertexMergeThreshold", 0.001f,
        "Triangle vertices that are closer together than this threshold will be merged into one "
        "(if possible depending on other vertex data)"};
    OXCType<uint32_t> maxRayDepth{this, "maxRayDepth", 6u, "Global maximum ray depth"};
    OXCType<uint32_t> reflectionDepth{this, "reflectionDepth", 2u, "Maximum reflection bounces"};
    OXCType<uint32_t> refractionDepth{this, "refractionDepth", 4u, "Maximum refractions"};
    OXCType<uint32_t> transparencyDepth{this, "transparencyDepth", 50u,
                                        "Maximum transparency depth"};
    OXCType<uint32_t> giTransparencyDepth{this, "giTransparencyDepth", 2u,
                                          "Maximum transparency depth for gathering rays"};
    OXCType<uint32_t> shadowDepth{this, "shadowDepth", 2u, "Maximum ray depth to include shadows"};
    OXCType<float> bias{this, "bias", 0.005f,
                        "Bias for secondary ray. Will be scene dependently choosen if set to 0"};
    OXCType<uint32_t> maxShadowRays{this, "maxShadowRays", 4294967295u,
                                    "Maximum number of shadow rays for light source"};
    OXCType<uint32_t> minShadowRays{this, "minShadowRays", 0u,
                                    "Sets a global min count for shadow rays"};
    OXCType<uint32_t> maxGlossyRays{this, "maxGlossyRays", 4294967295u,
                                    "Maximum number of reflection rays from a glossy surface"};
    OXCType<float> reflectionThreshold{
        this, "reflectionThreshold", 0.001f,
        "Minimum intensity of a reflection for it to considered at all"};
    OXCType<float> refractionThreshold{
        this, "refractionThreshold", 0.001f,
        "Minimum intensity of a refraction for it to considered at all"};
    OXCEnum<MotionBlurMode> motionBlur{this, "motionBlur", MotionBlurMode::Off,
                                       "Motion Blur type to use"};
    OXCType<uint32_t> motionSteps{
        this, "motionSteps", 1u,
        "The number of pieces the motion path should be divided into, must be higher than on for "
        "sampling non-linear motions correctly, but speeds up long linear moves as well. Kestrin "
        "only."};
    OXCType<float> blurLength{this, "blurLength", 1.0f,
                              "The length of the motion blur. Kestrin Only"};
    OXCType<float> shutterOpen{this, "shutterOpen", 1.0f,
                               "The time when the shutter opens. Kestrin only"};
    OXCType<float> shutterClose{this, "shutterClose", 1.0f,
                                "The time when the shutter closes. Kestrin only"};
    OXCType<bool> motionVectorsOnly{
        this, "motionVectorsOnly", false,
        "Output the motion vectors instead of performing full 2D motion blur. Kestrin Only"};
    OXCType<bool> cameraBlur{this, "cameraBlur", false,
                             "If true, considers the camera movement as well. Kestrin Only"};
    OXCType<bool> deformationBlur{
        this, "deformationBlur", false,
        "If true, sample complete movement instead of the rotation/translation matrix. must be "
        "enable to sample IK and deformable shapes. Kestrin Only."};
    OXCType<bool> lightsBlur{this, "lightsBlur", false,
                             "If true, move the light sources as well. Kestrin Only"};
    OXCType<bool> tsOddUVFlipping{this, "tsOddUVFlipping", true,
                                  "Flip Tangents for Clockwise tangent spaces"};
    OXCType<bool> tsVertexOrthogonalization{this, "tsVertexOrthogonalization", true,
                                            "Orthogonolize the tangent space on each vertex"};
    OXCType<bool> tsVertexNormalization{this, "tsVertexNormalization", true,
                                        "Normalize the tangent space on each vertex"};
    OXCType<bool> tsIntersectionOrthogonalization{
        this, "tsIntersectionOrthogonalization", true,
        "Orthogonalize the tangent space on each fragment"};
    OXCType<bool> tsIntersectionNormalization{this, "tsIntersectionNormalization", true,
                                              "Normalize the tangent space on each fragment"};
};

/// Environment settings: ray-traced and GI environments, sky light, IBL (type
/// "EnvironmentSettings").
class EnvironmentSettingsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    EnvironmentSettingsBase();

    OXCEnum<EnvironmentType> rtEnvironment{
        this, "rtEnvironment", EnvironmentType::Camera,
        "Selects what environment to use for primary, reflection, refraction etc rays missing "
        "geometry or reaching the maximum ray depth"};
    OXCType<float> rtEnvironmentIntensity{
        this, "rtEnvironmentIntensity", 1.0f,
        "An intensity scale for the environment set in rtEnvironment"};
    OXCType<bool> rtEnvironmentEye{this, "rtEnvironmentEye", true,
                                   "Enables and disables the environment for eye rays"};
    OXCType<bool> rtEnvironmentRefl{this, "rtEnvironmentRefl", true,
                                    "Enables and disables the environment for reflection rays"};
    OXCType<bool> rtEnvironmentRefr{this, "rtEnvironmentRefr", true,
                                    "Enables and disables the environment for refraction rays"};
    OXCEnum<EnvironmentType> giEnvironment{this, "giEnvironment", EnvironmentType::Camera,
                                           "Selects what environment to use for GI purposes"};
    OXCType<float> giEnvironmentIntensity{
        this, "giEnvironmentIntensity", 1.0f,
        "An intensity scale for the environment set in giEnvironment"};
    OXCType<float> giPrimaryScale{
        this, "giPrimaryScale", 1.0f,
        "An intensity scale for the environment set in giEnvironment, only for primary GI rays"};
    OXCType<float> giSecondaryScale{
        this, "giSecondaryScale", 1.0f,
        "An intensity scale for the environment set in giEnvironment, only for secondary GI rays"};
    OXCType<Color> globalAmbientColor{this, "globalAmbientColor", Color{0.0f, 0.0f, 0.0f, 0.0f},
                                      "Sets a global ambient light color"};
    OXCType<std::string> skyLightShader{this, "skyLightShader", "",
                                        "Sets a skylight shader (Kestrin only)"};
    OXCType<Color> skyLightColor{
        this, "skyLightColor", Color{0.0f, 0.0f, 0.0f, 0.0f},
        "Sets a skylight color, only valid if rtEnvironment or giEnvironment == SkyLight"};
    OXCType<int32_t> iblSamples{this, "iblSamples", 300,
                                "Number of virtual light sources per pixel for the IBL"};
    OXCType<std::string> iblImageFile{this, "iblImageFile", "-",
                                      "Path to the image file to use as IBL"};
    OXCType<float> iblIntensity{this, "iblIntensity", 1.0f, "Sets an intensity scale for the IBL"};
    OXCType<float> iblBandingVsNoise{this, "iblBandingVsNoise", 1.0f,
                                     "Sets the ratio between banding and noise in the IBL"};
    OXCType<float> iblTurnDome{this, "iblTurnDome", 0.0f,
                               "Rotation angle for the IBL (in degrees)"};
    OXCType<float> iblSpecularBoost{this, "iblSpecularBoost", 1.0f,
                                    "Scale factor for specular light for the IBL"};
    OXCType<bool> iblSwapYZ{this, "iblSwapYZ", false, "Makes Make Z point upwards for the IBL"};
    OXCType<bool> iblEmitLight{this, "iblEmitLight", false, "Enables light emission from the IBL"};
    OXCType<bool> iblEmitDiffuse{
        this, "iblEmitDiffuse", true,
        "Enables emission of diffuse light from the IBL (only valid if iblEmitLight is true)"};
    OXCType<bool> iblEmitSpecular{
        this, "iblEmitSpecular", false,
        "Enables emission of specular light from the IBL (only valid if iblEmitLight is true)"};
    OXCType<bool> iblShadows{this, "iblShadows", true, "Enables shadows for the IBL"};
    OXCType<bool> iblEmitPhotons{this, "iblEmitPhotons", false,
                                 "Enable photon emission from the IBL"};
    OXCType<int32_t> iblCausticsPhotons{
        this, "iblCausticsPhotons", 10000,
        "How many caustics photons to emit from the IBL, only valid if iblEmitPhotons is true"};
    OXCType<int32_t> iblGlobalPhotons{
        this, "iblGlobalPhotons", 10000,
        "How many diffuse photons to emit from the IBL, only valid if iblEmitPhotons is true"};
    OXCType<int32_t> iblPhotonEnergy{this, "iblPhotonEnergy", 10000,
                                     "The total energy in the photons emitted from the IBL"};
    OXCType<float> iblGIEnvBlur{this, "iblGIEnvBlur", 0.05f,
                                "Sets a blur factor for the IBL for GI uses. 1.0 means it uses the "
                                "average color, 0.0 uses the image unchanged"};
};

}  // namespace ox
