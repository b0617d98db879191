#pragma once

#include <cstdint>
#include <string>

#include "config/settings_frame.h"
#include "config/type.h"
#include "core/types.h"

/// Texture bake settings: targets, bake shapes, render components and the settings of their passes.
namespace ox {

/// Enumeration "NormalDirectionType".
enum class NormalDirectionType : int32_t { Front, Back, Camera };
OX_ENUM_NAMES(NormalDirectionType, "NormalDirectionType", "Front", "Back", "Camera");

/// Enumeration "WindingOrder".
enum class WindingOrder : int32_t { Clockwise, CounterClockwise };
OX_ENUM_NAMES(WindingOrder, "WindingOrder", "Clockwise", "CounterClockwise");

/// Enumeration "UVRangeType".
enum class UVRangeType : int32_t { Default, Entire, Specified };
OX_ENUM_NAMES(UVRangeType, "UVRangeType", "Default", "Entire", "Specified");

/// Enumeration "AllowNegative".
enum class AllowNegative : int32_t { Allow, Disallow, DisallowCullHorizon };
OX_ENUM_NAMES(AllowNegative, "AllowNegative", "Allow", "Disallow", "DisallowCullHorizon");

/// Enumeration "RNMBasis".
enum class RNMBasis : int32_t { UnrealEngine, UnrealEngineFlipped };
OX_ENUM_NAMES(RNMBasis, "RNMBasis", "UnrealEngine", "UnrealEngineFlipped");

/// Enumeration "RNMComponents".
enum class RNMComponents : int32_t { DirectLight, IndirectLight, DirectAndIndirectLight };
OX_ENUM_NAMES(RNMComponents, "RNMComponents", "DirectLight", "IndirectLight",
              "DirectAndIndirectLight");

/// Enumeration "NormalizeRange".
enum class NormalizeRange : int32_t { Max, MinMax };
OX_ENUM_NAMES(NormalizeRange, "NormalizeRange", "Max", "MinMax");

/// Enumeration "NormalizeOutput".
enum class NormalizeOutput : int32_t { PerChannel, Linked };
OX_ENUM_NAMES(NormalizeOutput, "NormalizeOutput", "PerChannel", "Linked");

/// Enumeration "NormalizeComponent".
enum class NormalizeComponent : int32_t { Shape, Image };
OX_ENUM_NAMES(NormalizeComponent, "NormalizeComponent", "Shape", "Image");

/// Enumeration "LightPassType".
enum class LightPassType : int32_t { LightMap, ShadowMap, FullShading };
OX_ENUM_NAMES(LightPassType, "LightPassType", "LightMap", "ShadowMap", "FullShading");

/// One instance baked into a target, with its UV set and UV transform (type "BakeShape").
class BakeShapeBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    BakeShapeBase();

    OXCType<std::string> target{this, "target", "", "Target surface"};
    OXCType<bool> hasUVSetOverride{this, "hasUVSetOverride", false,
                                   "Flag to set if a custom uv is supplied for this shape"};
    OXCType<std::string> UVSetOverride{
        this, "UVSetOverride", "",
        "String representing a changed uv set, only used if hasUVSetOverride is true"};
    OXCType<Vec2> UVScale{
        this, "UVScale", Vec2{1.0f, 1.0f},
        "Sets the scale of the light map uv's (for bake purposes only) for the shape"};
    OXCType<Vec2> UVBias{
        this, "UVBias", Vec2{0.0f, 0.0f},
        "Sets the offset of the light map uv's (for bake purposes only) for the shape"};
    OXCType<std::string> name{this, "name", "",
                              "Sets a unique name for the shape, can be accessed from the render "
                              "passes (i.e the light pass)"};
};

/// One baked texture and the shapes that share it (type "BakeTextureTarget").
class BakeTextureTargetBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    BakeTextureTargetBase();

    OXCType<std::string> textureName{this, "textureName", "default",
                                     "Name of the texture to bake (for file name generation)"};
    OXCType<bool> hasResolutionOverride{this, "hasResolutionOverride", false,
                                        "Enables resolution override"};
    OXCType<Vec2i> resolutionOverride{
        this, "resolutionOverride", Vec2i{512, 512},
        "Sets bake resolution. Only valid if hasResolutionOverride = true"};
    OXCTypedComplexVector<BakeShapeBase> targetSurfaces{
        this, "targetSurfaces", "List of surfaces to include in this bake target"};
};

/// Radiosity normal map pass settings (type "RNMSettings").
class RNMSettingsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    RNMSettingsBase();

    OXCType<int32_t> samples{
        this, "samples", 300,
        "Number of samples to take for indirect light. Not valid if components = DirectLight"};
    OXCType<bool> adaptive{this, "adaptive", false,
                           "If true, the radiance cache is used, which lowers the render times and "
                           "improves the result"};
    OXCType<bool> adjustIntensity{
        this, "adjustIntensity", false,
        "Adjust the intensity of RNM to give correct intensity for normal oriented surface"};
    OXCType<bool> includeNormalComponent{
        this, "includeNormalComponent", false,
        "Include a 4th component containing the light contribution in the normal direction"};
    OXCEnum<AllowNegative> allowNegative{
        this, "allowNegative", AllowNegative::DisallowCullHorizon,
        "Don't clamp light contributions behind the RNM base vectors and allow result values to "
        "have negative intensities"};
    OXCEnum<RNMBasis> basis{this, "basis", RNMBasis::UnrealEngine, "Basis to use"};
    OXCEnum<RNMComponents> components{this, "components", RNMComponents::DirectLight,
                                      "Light contribution to bake"};
    OXCType<bool> enableLambertianClamp{this, "enableLambertianClamp", false,
                                        "Enable clamping of lights with high lambertian term"};
    OXCType<float> lambertianClamp{this, "lambertianClamp", 2.0f,
                                   "Clamps the lambertian contribution of the light to this value, "
                                   "only valid if enableLamberianClamp is true"};
    OXCType<float> cosLobeExponent{this, "cosLobeExponent", 1.0f, nullptr};
    OXCType<bool> monochrome{
        this, "monochrome", false,
        "Create an monochrome RNM. It will contain the average color for the basis, and a max "
        "component for each basis. This modes uses one less texture than a standard rnm, but will "
        "only alter intensity when combined with the normal map."};
};

/// Normalisation of baked values to compress the dynamic range (type "Normalize").
class NormalizationBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    NormalizationBase();

    OXCType<bool> normalizeValues{this, "normalizeValues", false,
                                  "Normalizes the color values to between 1 and 0 per shape and "
                                  "outputs an xml file with the min and max values"};
    OXCEnum<NormalizeRange> normalizeRange{
        this, "normalizeRange", NormalizeRange::Max,
        "Defines which range in the output is remapped to 0.0 - 1.0. 'Max' remaps [0, max] -> [0, "
        "1], 'MinMax' remaps [min, max] -> [0, 1]"};
    OXCEnum<NormalizeOutput> normalizeOutput{
        this, "normalizeOutput", NormalizeOutput::PerChannel,
        "Defines on which part of the image data the normalization is done. PerChannel will remap "
        "each channel in the output, Linked will remap the complete output"};
    OXCEnum<NormalizeComponent> normalizeComponent{
        this, "normalizeComponent", NormalizeComponent::Shape,
        "Defines on which part of the content in the image the normalization is done. Shape will "
        "normalize each shape separately, Image will remap all shapes together"};
    OXCType<bool> normalizeAlpha{
        this, "normalizeAlpha", false,
        "Defines if the alpha channel is to be included in the normalization."};
};

/// Script of the Lua pass (type "LUASettings").
class LUASettingsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    LUASettingsBase();

    OXCType<std::string> scriptFile{this, "scriptFile", "", "LUA script file to use for baking"};
};

/// One light pass: its kind, lights and affected shapes (type "LightPassEntry").
class LightPassEntryBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    LightPassEntryBase();

    OXCEnum<LightPassType> bakeType{
        this, "bakeType", LightPassType::ShadowMap,
        "What kind of light pass to bake, allowed values, LightMap, ShadowMap, FullShading"};
    OXCTypedVector<std::string> lights{
        this, "lights", "A vector of lights that should affect the members of the light pass"};
    OXCTypedVector<std::string> affectedTargets{
        this, "affectedTargets",
        "A vector of instances that should be affected by the light pass. Note that it corresponds "
        "to the \"name\" tag of the surface transfer settings and bake shape"};
};

/// Signed distance field conversion of light passes (type "LightPassSettings").
class LightPassSettingsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    LightPassSettingsBase();

    OXCType<bool> signedDistanceField{this, "signedDistanceField", false,
                                      "Convert the resulting image to a signed distance field"};
    OXCType<int32_t> signedDistanceFieldPixelFilterSize{
        this, "signedDistanceFieldPixelFilterSize", 20,
        "Sets the maximum search range in pixels in the image"};
    OXCType<float> signedDistanceFieldMaxWorldDistance{
        this, "signedDistanceFieldMaxWorldDistance", 1.0f,
        "Set maximum world distance to be stored in the signed distance field image"};
};

/// Lights fully baked into both outputs of the full+indirect pass (type
/// "FullAndIndirectIlluminationSettings").
class FullAndIndirectIlluminationSettingsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    FullAndIndirectIlluminationSettingsBase();

    OXCTypedVector<std::string> fullyBakedLights{this, "fullyBakedLights",
                                                 "The direct light contribution from these lights "
                                                 "will be present in both outputs of this pass"};
};

/// The passes a texture bake produces (type "RenderComponents").
class RenderComponentsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    RenderComponentsBase();

    OXCType<bool> fullShading{this, "fullShading", false, "Bake full shading"};
    OXCType<bool> illumination{this, "illumination", false, "Bake incoming illumination"};
    OXCType<bool> indirectIllumination{this, "indirectIllumination", false,
                                       "Bake incoming indirect illumination"};
    OXCType<bool> fullAndIndirectIllumination{this, "fullAndIndirectIllumination", false,
                                              "Bake direct+indirect and indirect"};
    OXCType<bool> albedo{this, "albedo", false, "Bake albedo pass"};
    OXCType<bool> diffuse{this, "diffuse", false, "Bake diffuse pass"};
    OXCType<bool> specular{this, "specular", false, "Bake specular pass"};
    OXCType<bool> ambient{this, "ambient", false, "Bake ambient pass"};
    OXCType<bool> incandescence{this, "incandescence", false, "Bake incandescence pass"};
    OXCType<bool> sss{this, "sss", false, "Bake sub surface scattering pass"};
    OXCType<bool> reflections{this, "reflections", false, "Bake reflections pass"};
    OXCType<bool> refractions{this, "refractions", false, "Bake refractions pass"};
    OXCType<bool> rnm{this, "rnm", false, "Bake Radiosity Normal Map pass"};
    OXCType<bool> lua{this, "lua", false, "Bake LUA pass"};
    OXCType<bool> normals{this, "normals", false, "Bake Normal Map pass"};
    OXCTypedVector<std::string> customPasses{
        this, "customPasses", "Vector, add ambientOcclusion to it if you want an AO pass"};
    OXCNested<RNMSettingsBase> RNMSettings{
        this, "", "Radiosity Normal Map settings. Only valid if rnm = true"};
    OXCNested<LUASettingsBase> LUASettings{this, "", "LUA settings. Only valid if lua = true"};
    OXCTypedComplexVector<LightPassEntryBase> lightPass{this, "lightPass",
                                                        "A vector of light pass entries to render"};
    OXCNested<FullAndIndirectIlluminationSettingsBase> FullAndIndirectIlluminationSettings{this, "",
                                                                                           nullptr};
    OXCNested<LightPassSettingsBase> LightPassSettings{this, "", nullptr};
};

/// Texture bake settings (type "TextureBakeSettings").
class TextureBakeSettingsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    TextureBakeSettingsBase();

    OXCType<bool> useRenderView{this, "useRenderView", false, "Not Relevant in Vorn"};
    OXCType<bool> saveToFile{this, "saveToFile", true, "Save baked texture to file (Vendrel)"};
    OXCType<bool> saveToRenderView{this, "saveToRenderView", false,
                                   "Save baked texture to Render View (Vendrel)"};
    OXCType<bool> conservativeRasterization{
        this, "conservativeRasterization", false,
        "Solves baking problems for triangles thinner than 1 pixel"};
    OXCType<std::string> directory{this, "directory", "", "Output directory (Vendrel)"};
    OXCType<std::string> fileName{this, "fileName", "", "File name pattern (Vendrel)"};
    OXCEnum<ImageFormatType> imageFormat{this, "imageFormat", ImageFormatType::TGA,
                                         "File format (Vendrel)"};
    OXCType<int32_t> edgeDilation{this, "edgeDilation", 5, "Edge dilation size"};
    OXCType<bool> bilinearFilter{this, "bilinearFilter", true,
                                 "Filter baked texture optimized for bilinear filtering"};
    OXCType<Color> bgColor{this, "bgColor", Color{0.0f, 0.0f, 0.0f, 0.0f}, "Background color"};
    OXCEnum<NormalDirectionType> normalDirection{
        this, "normalDirection", NormalDirectionType::Front,
        "Selects whether to bake the front or the back of the vertex"};
    OXCType<bool> shadows{this, "shadows", false, "Enables baking of shadows"};
    OXCType<bool> orthoRefl{
        this, "orthoRefl", true,
        "Selects if to bake orthogonal reflections or reflections from the camera"};
    OXCType<bool> viewDependent{this, "viewDependent", false,
                                "Selects if vertices not facing the camera should be baked or not"};
    OXCType<bool> alpha{this, "alpha", false, "Enables baking of alpha"};
    OXCType<float> edgeBias{this, "edgeBias", 0.0f,
                            "Bias texture samples away from triangle edges (avoid e.g. gather "
                            "artifacts at triangle edges)"};
    OXCEnum<WindingOrder> windingOrder{this, "windingOrder", WindingOrder::CounterClockwise,
                                       "Preferred winding order of triangles to bake"};
    OXCType<float> resolutionScale{this, "resolutionScale", 1.0f,
                                   "Scale factor of output texture resolution"};
    OXCType<bool> visualize{this, "visualize", false, "Not Relevant in Vorn"};
    OXCType<bool> clamp{this, "clamp", false, "Clamp colors of baked result"};
    OXCType<Color> colorMin{this, "colorMin", Color{0.0f, 0.0f, 0.0f, 0.0f},
                            "Min values for clamping. Only valid if clamping is enabled"};
    OXCType<Color> colorMax{this, "colorMax", Color{1.0f, 1.0f, 1.0f, 1.0f},
                            "Max values for clamping. Only valid if clamping is enabled"};
    OXCType<float> rgbScale{this, "rgbScale", 1.0f, "Scale factor for baked color"};
    OXCType<float> alphaScale{this, "alphaScale", 1.0f, "Scale factor for baked alpha"};
    OXCType<std::string> uvSet{this, "uvSet", "", "UV set to bake to"};
    OXCType<std::string> tangentUvSet{
        this, "tangentUvSet", "", "Sets what UV set to derive tangent space from for bake output"};
    OXCEnum<UVRangeType> uvRange{this, "uvRange", UVRangeType::Default,
                                 "Sets what UV ranged to be used"};
    OXCType<float> uMin{this, "uMin", 0.0f, "Minimum U. Only valid if uvRange = Specified"};
    OXCType<float> vMin{this, "vMin", 0.0f, "Minimum V. Only valid if uvRange = Specified"};
    OXCType<float> uMax{this, "uMax", 1.0f, "Maximum U. Only valid if uvRange = Specified"};
    OXCType<float> vMax{this, "vMax", 1.0f, "Maximum V. Only valid if uvRange = Specified"};
    OXCTypedComplexVector<BakeTextureTargetBase> targets{
        this, "targets",
        "Targets to baked. Ignored if doing surface transfer (use targets in surface transfer "
        "settings instead)"};
    OXCNested<NormalizationBase> Normalize{
        this, "", "Settings to normalize the rendered output to compress the dynamic range"};
    OXCNested<RenderComponentsBase> RenderComponents{this, "", "Specifies what components to bake"};
};

}  // namespace ox
