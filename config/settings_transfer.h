#pragma once

#include <cstdint>
#include <string>

#include "config/type.h"
#include "core/types.h"

/// Surface transfer settings: search, selection, normal maps, range remapping, transfer textures
/// and their UV packing.
namespace ox {

/// Enumeration "UVPackAlignType".
enum class UVPackAlignType : int32_t { Keep, TexelLowerLeft, TexelCenter };
OX_ENUM_NAMES(UVPackAlignType, "UVPackAlignType", "Keep", "TexelLowerLeft", "TexelCenter");

/// Enumeration "UVPackAlgorithmType".
enum class UVPackAlgorithmType : int32_t { Block = 1, Texel = 2 };
OX_ENUM_VALUES(UVPackAlgorithmType, "UVPackAlgorithmType", {"Block", 1}, {"Texel", 2});

/// Enumeration "UVPackSizeType".
enum class UVPackSizeType : int32_t { Ratio, Resolution };
OX_ENUM_NAMES(UVPackSizeType, "UVPackSizeType", "Ratio", "Resolution");

/// Enumeration "SurfTransSelectionMode".
enum class SurfTransSelectionMode : int32_t { Distance, Normal, FlippedNormal };
OX_ENUM_NAMES(SurfTransSelectionMode, "SurfTransSelectionMode", "Distance", "Normal",
              "FlippedNormal");

/// Enumeration "SurfTransMismatchMode".
enum class SurfTransMismatchMode : int32_t { Background, Target };
OX_ENUM_NAMES(SurfTransMismatchMode, "SurfTransMismatchMode", "Background", "Target");

/// Enumeration "SurfTransEnvelopeMode".
enum class SurfTransEnvelopeMode : int32_t {
    Closest,
    InsideOnly,
    OutsideOnly,
    InsideFirst,
    OutsideFirst
};
OX_ENUM_NAMES(SurfTransEnvelopeMode, "SurfTransEnvelopeMode", "Closest", "InsideOnly",
              "OutsideOnly", "InsideFirst", "OutsideFirst");

/// Enumeration "TransferCoordSystemType".
enum class TransferCoordSystemType : int32_t { ObjectSpace, WorldSpace };
OX_ENUM_NAMES(TransferCoordSystemType, "TransferCoordSystemType", "ObjectSpace", "WorldSpace");

/// Enumeration "CoordSystemType".
enum class CoordSystemType : int32_t { TangentSpace, ObjectSpace, WorldSpace, CameraSpace };
OX_ENUM_NAMES(CoordSystemType, "CoordSystemType", "TangentSpace", "ObjectSpace", "WorldSpace",
              "CameraSpace");

/// Enumeration "NormalMapFlipChannelType".
enum class NormalMapFlipChannelType : int32_t { Default, InvertRed, InvertGreen, FlipRedGreen };
OX_ENUM_NAMES(NormalMapFlipChannelType, "NormalMapFlipChannelType", "Default", "InvertRed",
              "InvertGreen", "FlipRedGreen");

/// Automatic UV packing of one transfer texture (type "UVPackSettings").
class UVPackTextureSettingsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    UVPackTextureSettingsBase();

    OXCType<bool> enabled{this, "enabled", false, "Enable UV-packing for this texture"};
    OXCType<Vec2i> resolution{
        this, "resolution", Vec2i{1024, 1024},
        "Set a maximum target resolution for the UV-map. Resulting size may be smaller."};
    OXCType<float> ratio{this, "ratio", 1.0f,
                         "Set texels per world unit ratio, can be scaled on target level, or you "
                         "may specify exact texel resolutions."};
    OXCType<int32_t> padding{this, "padding", 0, "Set padding between block in pixels"};
    OXCType<int32_t> alignment{this, "alignment", 1, "Align blocks at this interval"};
    OXCEnum<UVPackAlignType> alignShape{
        this, "alignShape", UVPackAlignType::TexelCenter,
        "Set how UV channel content aligns to texels. It lets you either keep existing UV "
        "coordinates, align to texel centers or align to lower left corner of texel."};
    OXCEnum<UVPackAlgorithmType> type{this, "type", UVPackAlgorithmType::Texel,
                                      "Type of UV-packing algorithm. Texel mode looks at the "
                                      "actual UV-space content to pack more efficiently."};
    OXCType<bool> spatial{this, "spatial", true,
                          "Pack spatially close objects into the same lightmap"};
    OXCType<int32_t> maxTextures{this, "maxTextures", 0, nullptr};
};

/// UV packing size of one target shape (type "UVPackTargetSettings").
class UVPackTargetSettingsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    UVPackTargetSettingsBase();

    OXCType<float> ratioScale{
        this, "ratioScale", 1.0f,
        "Scales the texel ratio for this target, a value of 2.0 doubles the resolution"};
    OXCType<Vec2i> resolution{this, "resolution", Vec2i{512, 512},
                              "Set a UV-packing pixel resolution"};
    OXCEnum<UVPackSizeType> type{
        this, "type", UVPackSizeType::Ratio,
        "Set if UV-map size is set by pixel resolution or by texel per world unit ratio"};
};

/// HDR to LDR remapping of one layer (type "RangeRemapSettings").
class RangeRemapSettingsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    RangeRemapSettingsBase();

    OXCType<std::string> layer{this, "layer", "", nullptr};
    OXCType<bool> remapRGB{this, "remapRGB", true, nullptr};
    OXCType<bool> remapAlpha{this, "remapAlpha", false, nullptr};
    OXCType<float> newRangeMin{this, "newRangeMin", 0.0f, "Reserved"};
    OXCType<float> newRangeMax{this, "newRangeMax", 1.0f, "Reserved"};
};

/// One target surface with its source and envelope surfaces (type "SurfaceTransferTarget").
class SurfaceTransferTargetBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    SurfaceTransferTargetBase();

    OXCType<std::string> target{this, "target", "", nullptr};
    OXCTypedVector<std::string> sourceSurfaces{this, "sourceSurfaces",
                                               "List of contributing surfaces"};
    OXCTypedVector<std::string> envelopeSurfaces{this, "envelopeSurfaces",
                                                 "List of envelope surfaces"};
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
    OXCNested<UVPackTargetSettingsBase> UVPackTargetSettings{this, "", nullptr};
};

/// One texture produced by surface transfer and its target surfaces (type
/// "SurfaceTransferTexture").
class SurfaceTransferTextureBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    SurfaceTransferTextureBase();

    OXCType<std::string> textureName{this, "textureName", "default",
                                     "Name of the texture to bake (for file name generation)"};
    OXCType<bool> hasResolutionOverride{this, "hasResolutionOverride", false, nullptr};
    OXCType<Vec2i> resolutionOverride{
        this, "resolutionOverride", Vec2i{512, 512},
        "Sets bake resolution. Only valid if hasResolutionOverride = true"};
    OXCNested<UVPackTextureSettingsBase> UVPackSettings{this, "",
                                                        "Options for automatic UV-packing"};
    OXCTypedComplexVector<SurfaceTransferTargetBase> targetSurfaces{
        this, "targetSurfaces", "List of surfaces to include in this bake target"};
};

/// Surface transfer settings (type "SurfaceTransferSettings").
class SurfaceTransferSettingsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    SurfaceTransferSettingsBase();

    OXCType<float> frontRange{this, "frontRange", 100.0f,
                              "Maximum range to search for surfaces outside the base face"};
    OXCType<float> backRange{this, "backRange", 100.0f,
                             "Maximum range to search for surfaces inside the base face"};
    OXCType<float> frontBias{this, "frontBias", 0.0f, "Bias for the search outside the face"};
    OXCType<float> backBias{this, "backBias", 0.0f, "Bias for the search inside the face"};
    OXCEnum<SurfTransSelectionMode> selectionMode{
        this, "selectionMode", SurfTransSelectionMode::Distance, "How to prioritize hits"};
    OXCEnum<SurfTransMismatchMode> mismatchMode{
        this, "mismatchMode", SurfTransMismatchMode::Target,
        "How to treat parts where no source surface is found"};
    OXCEnum<SurfTransEnvelopeMode> envelopeMode{
        this, "envelopeMode", SurfTransEnvelopeMode::Closest,
        "How to treat envelope surfaces, Only valid if usingEnvelopes = true"};
    OXCType<bool> usingEnvelopes{this, "usingEnvelopes", false, "Enable envelope meshes"};
    OXCType<bool> ignoreInconsistentNormals{
        this, "ignoreInconsistentNormals", true,
        "Ignore hits with normals facing away from the emitting surface"};
    OXCEnum<TransferCoordSystemType> transferSpace{this, "transferSpace",
                                                   TransferCoordSystemType::WorldSpace,
                                                   "What space to do the surface transfer in"};
    OXCType<bool> considerTransparency{
        this, "considerTransparency", false,
        "If set to true, the transparency of the high poly surface will be evaluted. If "
        "transparent, a new ray will be sent to sample further."};
    OXCType<float> transparencyThreshold{
        this, "transparencyThreshold", 0.001f,
        "Decides when to stop the surface sampling, a low value will cause more accurate "
        "transparency sampling. Only useful when Consider Transparency is set to true."};
    OXCEnum<CoordSystemType> normalsCoordSys{
        this, "normalsCoordSys", CoordSystemType::TangentSpace,
        "Coordinate system for normal map generation (Vendrel only)"};
    OXCEnum<NormalMapFlipChannelType> normalsFlipChannel{
        this, "normalsFlipChannel", NormalMapFlipChannelType::Default,
        "0 = no change, 1 = flip red, 2 = flip green, 3 = flip blue"};
    OXCType<bool> normalsUseFaceTangents{this, "normalsUseFaceTangents", false,
                                         "If set to true, calculates face tangents instead of "
                                         "using and interpolating fancy vertex tangents."};
    OXCType<bool> normalsUseBump{this, "normalsUseBump", false,
                                 "If true, consider the bump map applied to the high poly surface"};
    OXCType<bool> stencilBake{this, "stencilBake", false,
                              "bakes a hit or miss map to the alpha channel. Useful if the high "
                              "poly has a lot of holes in it."};
    OXCType<bool> displacementAlpha{this, "displacementAlpha", false,
                                    "Store the displacment map in the alpha channel"};
    OXCTypedComplexVector<RangeRemapSettingsBase> rangeRemapLayers{
        this, "rangeRemapLayers", "Sets how the remapping of HDR data to LDR should be done"};
    OXCTypedComplexVector<SurfaceTransferTextureBase> targets{
        this, "targets", "List of Targets for surface transferring"};
};

}  // namespace ox
