#pragma once

#include <cstdint>
#include <string>

#include "core/random.h"
#include "core/types.h"
#include "render/color_correction.h"
#include "render/frame.h"

/// The image writers: multi-layer and single-image OpenEXR, TGA and JPEG, and saveLayer,
/// which names the file and picks the writer.
///
/// Orientation: row 0 of a layer is the bottom row of the picture, and every file shows the
/// picture upright. TGA stores the bottom row first (as the format expects); JPEG and both
/// EXR writers store the top row (layer row height - 1) as the first line of the file.
///
/// Every writer writes to a temporary file beside the target and renames it over the target
/// only when complete: a failed write leaves no partial file and an existing file intact.
namespace ox {

/// How saveLayer stores a layer; stored as these integers.
enum SaveKind : int32_t {
    kSaveNone = 0,           ///< nothing is written
    kSaveEXR = 1,            ///< single-image EXR, RGB plus alpha
    kSaveMultiLayerEXR = 2,  ///< written by the run driver with writeMultiLayerEXR
    kSaveJPEG = 3,           ///< JPEG
    kSaveTGA32 = 4,          ///< TGA 32-bit with alpha
    kSaveTGA24 = 5,          ///< TGA 24-bit
};

/// The largest TGA width or height.
constexpr int32_t kTGAMaxSize = 65535;
/// The largest JPEG width or height.
constexpr int32_t kJPEGMaxSize = 65500;
/// The name of the attribute of multi-layer EXR files that marks the tiles with content.
inline constexpr const char *kActiveTilesAttribute = "QUENDAL_ACTIVETILES_PLAIN_TEXT";
/// The edge of the tiles of the active-tiles attribute.
constexpr int32_t kActiveTileSize = 32;

/// Lets the EXR writers compress on `threads` threads (the library's global thread pool;
/// 1 or less: on the writing thread only). The files are the same for any count.
void setImageWriterThreads(int32_t threads);

/// Writes every layer of the frame into one tiled, ZIP-compressed EXR file of 32-bit float
/// channels: colour layers as name.R, name.G, name.B (and name.A with alpha), boolean and
/// float layers as one channel named after the layer, custom-float layers as name0 .. nameN-1.
/// With a float layer "Z" the active-tiles attribute marks the 32 x 32 tiles whose mean "Z"
/// is <= -1 as "0". False after one message ("Error writing exr file: %s").
bool writeMultiLayerEXR(const std::string &fileName, Frame &frame, bool alpha);

/// Writes a colour layer as a scan-line, ZIP-compressed EXR file with channels R, G, B (and A
/// with alpha). False after one message ("Exr error: %s").
bool writeEXR(const std::string &fileName, LayerT<Color> &layer, bool alpha);

/// Writes a colour layer as an uncompressed 24-bit or 32-bit TGA file (at most 65535 pixels
/// each way), bottom row first, after the colour correction. False after one message.
bool writeTGA(const std::string &fileName, LayerT<Color> &layer, bool withAlpha,
              const ColorCorrectionInterface &correction, bool dither);

/// Writes a colour layer as a quality-100 RGB JPEG file (at most 65500 pixels each way), top
/// row first, after the colour correction. False after one message.
bool writeJPEG(const std::string &fileName, LayerT<Color> &layer,
               const ColorCorrectionInterface &correction, bool dither);

/// The file name of a single-image save: outputDirectory, baseName without the format's
/// extension followed by "_" when not empty, targetName, "_", layerName, extension.
std::string imageFileName(SaveKind kind, const std::string &baseName, const std::string &targetName,
                          const std::string &layerName, const std::string &outputDirectory);
/// The file name of a multi-layer EXR: outputDirectory, baseName without ".exr" followed by
/// "_" when not empty, targetName, ".exr".
std::string multiLayerFileName(const std::string &baseName, const std::string &targetName,
                               const std::string &outputDirectory);

/// Saves one layer of a frame by kind (see SaveKind). A colour layer of that name is written
/// as it stands; a custom-float layer of N channels as (N - 1) / 4 + 1 images of four
/// channels each, whose file names end the layer name with " g" (g from 0) when there are
/// several. A frame without such a layer, kSaveNone and kSaveMultiLayerEXR write nothing and
/// succeed. False after one message when a writer fails or the kind is unknown.
bool saveLayer(int32_t kind, const std::string &baseName, const std::string &targetName,
               const std::string &layerName, Frame &frame,
               const ColorCorrectionInterface &correction, bool dither,
               const std::string &outputDirectory);

/// Reduces a corrected channel value to 8 bits: x = c * 255 with NaN as 0; with a generator,
/// x rounds up when its fraction exceeds a uniform draw; then clamped to [0, 255] and
/// truncated.
inline uint8_t toByte(float c, Random *dither) {
    float x = c == c ? c * 255.0f : 0.0f;
    if (dither) {
        const float r = dither->next();
        const float f = std::floor(x);
        if (x - f > r) x = f + 1.0f;
    }
    x = x < 0.0f ? 0.0f : (x > 255.0f ? 255.0f : x);
    return uint8_t(x);
}

}  // namespace ox
