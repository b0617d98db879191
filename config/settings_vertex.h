#pragma once

#include <cstdint>
#include <string>

#include "config/settings_bake.h"
#include "config/type.h"
#include "core/types.h"

/// Vertex bake settings: passes, sampling, filtering, clamping and output.
namespace ox {

/// Enumeration "VertexSamplingType".
enum class VertexSamplingType : int32_t { PerVertex, TriangleSubdiv };
OX_ENUM_NAMES(VertexSamplingType, "VertexSamplingType", "PerVertex", "TriangleSubdiv");

/// The passes a vertex bake produces (type "VertexBakeComponents").
class VertexBakeComponentsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    VertexBakeComponentsBase();

    OXCType<bool> fullShading{this, "fullShading", false, "Bake full shading"};
    OXCType<bool> illumination{this, "illumination", false, "Bake incoming light"};
    OXCType<bool> indirectIllumination{this, "indirectIllumination", false,
                                       "Bake incoming indirect light"};
    OXCType<bool> fullAndIndirectIllumination{this, "fullAndIndirectIllumination", false, nullptr};
    OXCType<bool> rnm{this, "rnm", false, "Bake Radiosity Normal map"};
    OXCType<bool> lua{this, "lua", false, "Bake LUA pass"};
    OXCTypedVector<std::string> customPasses{this, "customPasses", nullptr};
    OXCNested<RNMSettingsBase> RNMSettings{this, "", "The settings for the radiosity normal map"};
    OXCNested<LUASettingsBase> LUASettings{this, "", "LUA settings. Only valid if lua = true"};
    OXCTypedComplexVector<LightPassEntryBase> lightPass{this, "lightPass", nullptr};
};

/// Sample placement per vertex or triangle (type "VertexBakeSamplingOptions").
class VertexBakeSamplingOptionsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    VertexBakeSamplingOptionsBase();

    OXCEnum<VertexSamplingType> Type{this, "Type", VertexSamplingType::TriangleSubdiv,
                                     "Selects the algorithms used to sample the vertex colors"};
    OXCType<int32_t> MinSamples{
        this, "MinSamples", 2,
        "Sets the minimum number of samples to use per triangle if triangles sampling is used"};
    OXCType<int32_t> MaxSamples{
        this, "MaxSamples", 8,
        "Sets the maximum number of samples to use per triangle if triangles sampling is used"};
    OXCType<int32_t> SubDivStepSize{
        this, "SubDivStepSize", 0,
        "If set to >0 uses a new vertex subdivision measure based on triangle area in world space"};
    OXCType<float> FootPrintScale{this, "FootPrintScale", 1.0f,
                                  "Scales the footprint of each vertex sample. This will affect "
                                  "the size of filters used by GI and texture filtering e.t.c."};
};

/// Vertex bake settings (type "VertexBakeSettings").
class VertexBakeSettingsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    VertexBakeSettingsBase();

    OXCEnum<NormalDirectionType> normalDirection{
        this, "normalDirection", NormalDirectionType::Front,
        "Selects whether to bake the front or the back of the vertex"};
    OXCType<bool> shadows{this, "shadows", false, "Enables baking of shadows"};
    OXCType<bool> orthoRefl{
        this, "orthoRefl", true,
        "Selects if to bake orthogonal reflections or reflections from the camera"};
    OXCType<bool> viewDependent{this, "viewDependent", false,
                                "Selects if vertices not facing the camera should be baked or not"};
    OXCType<bool> alpha{this, "alpha", true, "Enables baking of alpha"};
    OXCType<float> vertexBias{this, "vertexBias", 0.001f,
                              "Bias the vertex towards the center of the polygon"};
    OXCType<bool> saveToColorSet{
        this, "saveToColorSet", true,
        "If true, baked vertex colors will be save into a color set in the mesh (Vendrel)"};
    OXCType<bool> overwriteColorSet{this, "overwriteColorSet", true,
                                    "If true, existing color set will be used, otherwise a new "
                                    "color set will be created (Vendrel)"};
    OXCType<std::string> colorSet{
        this, "colorSet", "",
        "Sets the name of the color set to bake, empty to use default set (Vendrel)"};
    OXCType<bool> saveToFile{this, "saveToFile", false,
                             "Save baked vertices to a point cloud file"};
    OXCType<std::string> directory{this, "directory", "", "Output directory"};
    OXCType<std::string> fileName{this, "fileName", "", "File name pattern"};
    OXCType<bool> filter{this, "filter", false, "Enables filter"};
    OXCType<float> filterSize{this, "filterSize", 0.05f,
                              "The size of the filter relative to the object bounding box"};
    OXCType<float> filterShape{
        this, "filterShape", 1.1f,
        "A high value gives a wider filter. Only useful when filtering is enabled"};
    OXCType<float> filterNormalDev{
        this, "filterNormalDev", 6.0f,
        "The amount of which the normal can deviate and still be used in the filtering. Given in "
        "degrees and only used when filtering is enabled"};
    OXCType<bool> clamp{this, "clamp", false,
                        "Selects if the values should be clamped before stored"};
    OXCType<Color> colorMin{this, "colorMin", Color{0.0f, 0.0f, 0.0f, 0.0f},
                            "Min values for clamping. Only valid if clamping is enabled"};
    OXCType<Color> colorMax{this, "colorMax", Color{1.0f, 1.0f, 1.0f, 1.0f},
                            "Max values for clamping. Only valid if clamping is enabled"};
    OXCType<float> rgbScale{this, "rgbScale", 1.0f, "Scale factor for baked color"};
    OXCType<float> alphaScale{this, "alphaScale", 0.0f, "Scale factor for baked alpha"};
    OXCType<int32_t> useBlending{
        this, "useBlending", 1,
        "Controls how to blend existing colors and/or render passes. 0=Disable blending, 1=Blend "
        "with old colors, 2=Blend between passes creating a single new color set."};
    OXCType<int32_t> rgbBlend{this, "rgbBlend", 0, "Blend mode for color"};
    OXCType<int32_t> alphaBlend{this, "alphaBlend", 0, "Blend mode for alpha"};
    OXCType<bool> normalizeValues{
        this, "normalizeValues", false,
        "Normalizes the color values to between 1 and 0 per shape and outputs "
        "coeffScaleMin/coeffScaleMax properties to the corresponding ZPX output node"};
    OXCType<Color> bgColor{this, "bgColor", Color{0.0f, 0.0f, 0.0f, 0.0f}, "Background color"};
    OXCTypedVector<std::string> targetSurfaces{this, "targetSurfaces",
                                               "List of surfaces to vertex bake"};
    OXCNested<VertexBakeComponentsBase> VertexBakeComponents{this, "",
                                                             "Specifies what passes to bake"};
    OXCNested<VertexBakeSamplingOptionsBase> VertexBakeSamplingOptions{
        this, "", "Specifies the sampling rate for a vertex"};
};

}  // namespace ox
