#pragma once

#include <cstdint>
#include <string>

#include "config/type.h"
#include "core/types.h"

/// Frame settings: resolution, tiles, camera, region, run kind, output format, output colour
/// correction, message verbosity and threads.
namespace ox {

/// Enumeration "TileSchemeType".
enum class TileSchemeType : int32_t { Hilbert, LeftToRight, Concentric, Random };
OX_ENUM_NAMES(TileSchemeType, "TileSchemeType", "Hilbert", "LeftToRight", "Concentric", "Random");

/// Enumeration "RenderType".
enum class RenderType : int32_t {
    Render,
    TextureBake,
    VertexBake,
    SurfaceTransfer,
    VertexTransfer,
    PointCloudBake
};
OX_ENUM_NAMES(RenderType, "RenderType", "Render", "TextureBake", "VertexBake", "SurfaceTransfer",
              "VertexTransfer", "PointCloudBake");

/// Enumeration "ImageFormatType".
enum class ImageFormatType : int32_t { TGA, PPM, EXR, TIFF8, TIFF16, TIFF32, IFF, EXRMultiLayer };
OX_ENUM_NAMES(ImageFormatType, "ImageFormatType", "TGA", "PPM", "EXR", "TIFF8", "TIFF16", "TIFF32",
              "IFF", "EXRMultiLayer");

/// Enumeration "ColorCorrection".
enum class ColorCorrection : int32_t { None, Gamma, SRGB };
OX_ENUM_NAMES(ColorCorrection, "ColorCorrection", "None", "Gamma", "SRGB");

/// Output colour correction of written images (type "outputCorrection").
class OutputCorrectionBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    OutputCorrectionBase();

    OXCEnum<ColorCorrection> colorCorrection{this, "colorCorrection", ColorCorrection::None,
                                             "What type of color correction to do to outputs, "
                                             "None, Gamma and SRGB are the supported values"};
    OXCType<float> gamma{
        this, "gamma", 1.0f,
        "Sets output gamma correction. Only valid if outputCorrection is set to Gamma"};
};

/// Which message types are shown, and the "debug.out" copy (type "outputVerbosity").
class OutputVerbosityBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    OutputVerbosityBase();

    OXCType<bool> errorPrint{this, "errorPrint", true, "Enable messages of error type"};
    OXCType<bool> warningPrint{this, "warningPrint", true, "Enable messages of warning type"};
    OXCType<bool> benchmarkPrint{this, "benchmarkPrint", false,
                                 "Enable messages of benchmark type"};
    OXCType<bool> progressPrint{this, "progressPrint", true, "Enable messages of progress type"};
    OXCType<bool> infoPrint{this, "infoPrint", true, "Enable messages of info type"};
    OXCType<bool> verbosePrint{this, "verbosePrint", false, "Enable messages of verbose type"};
    OXCType<bool> debugPrint{this, "debugPrint", false, "Enable messages of debug type"};
    OXCType<bool> debugFile{this, "debugFile", false, "Enable saving all log messages to file."};
};

/// Frame settings (type "FrameSettings").
class FrameSettingsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    FrameSettingsBase();

    OXCType<Vec2i> resolution{this, "resolution", Vec2i{640, 480}, "Resolution for the rendering"};
    OXCType<Vec2i> tileSize{this, "tileSize", Vec2i{32, 32}, "Render tile size"};
    OXCEnum<TileSchemeType> tileScheme{this, "tileScheme", TileSchemeType::Hilbert,
                                       "Tile selection scheme"};
    OXCType<std::string> cameraName{this, "cameraName", "persp",
                                    "Name of the camera to render from"};
    OXCType<bool> regionRender{this, "regionRender", false, "Enables region rendering"};
    OXCType<Vec2i> regionLowerLeft{
        this, "regionLowerLeft", Vec2i{0, 0},
        "Lower left (inclusive) of the render region. Only valid if regionRender is true"};
    OXCType<Vec2i> regionTopRight{
        this, "regionTopRight", Vec2i{640, 480},
        "Upper right (exclusive) of the render region. Only valid if regionRender is true"};
    OXCEnum<RenderType> renderType{this, "renderType", RenderType::Render,
                                   "What kind of rendering to be done"};
    OXCEnum<ImageFormatType> imageFormat{this, "imageFormat", ImageFormatType::TGA,
                                         "Image format to output (Vendrel)"};
    OXCType<bool> alphaChannel{this, "alphaChannel", true,
                               "Save alpha if the output format supports it (Vendrel)"};
    OXCType<bool> depthChannel{this, "depthChannel", true,
                               "Save depth buffer if the output format supports it (Vendrel)"};
    OXCType<bool> motionChannel{this, "motionChannel", false, "Not relevant for Vorn"};
    OXCType<bool> premultiply{this, "premultiply", true, "Not relevant for Vorn"};
    OXCType<float> premultiplyThreshold{this, "premultiplyThreshold", 0.0f,
                                        "Not relevant for Vorn"};
    OXCType<float> inputGamma{this, "inputGamma", 1.0f,
                              "Gamma correction to apply to input colors and textures. For degamma "
                              "of images of gamma 2.2, a good value is .45"};
    OXCNested<OutputCorrectionBase> outputCorrection{this, "", "Output color correction settings"};
    OXCType<bool> dither{this, "dither", true, "Enable dithering when saving to LDR files"};
    OXCNested<OutputVerbosityBase> outputVerbosity{this, "", "Output verbosity settings"};
    OXCType<bool> autoThreads{this, "autoThreads", true,
                              "Auto detect number of render threads to use"};
    OXCType<uint32_t> autoThreadsSubtract{
        this, "autoThreadsSubtract", 0u,
        "Number to subtract from number of rendering threads if autoThreads is true. Can be used "
        "to leave some cores free for other work."};
    OXCType<uint32_t> renderThreads{
        this, "renderThreads", 2u,
        "Number of threads to use for rendering. Disregarded if autoThreads is true"};
};

}  // namespace ox
