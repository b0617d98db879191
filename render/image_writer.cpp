#include "render/image_writer.h"

#include <jpeglib.h>
#include <stdio.h>

#include <algorithm>
#include <cctype>
#include <csetjmp>
#include <cstring>
#include <string>
#include <vector>

#include "core/message.h"
#include "platform/file_system.h"

namespace ox {
namespace {

/// The text of the platform's last file error.
std::string fileError() {
    const int code = FileSystemUtilities::lastError();
    return code ? std::strerror(code) : "unknown error";
}

/// Reads colour rows [y0, y1) of a layer, corrects them and turns them into bytes, `channels`
/// (3 or 4) per pixel in the order of `order` (indices into r, g, b, a).
class ByteStrips {
public:
    ByteStrips(LayerT<Color> &layer, const ColorCorrectionInterface &correction, bool dither,
               int32_t maxRows, int channels, const int *order)
        : layer_(layer),
          correction_(correction),
          random_(kProcessRandomSeed),
          dither_(dither),
          channels_(channels),
          order_(order),
          colors_(size_t(layer.width()) * size_t(maxRows)),
          bytes_(colors_.size() * size_t(channels)) {}

    /// The bytes of rows [y0, y1), row y0 first; null when the layer refuses.
    const uint8_t *read(int32_t y0, int32_t y1) {
        const Region r(0, y0, layer_.width(), y1);
        if (!layer_.read(r, colors_.data())) return nullptr;
        const size_t n = size_t(r.area());
        correction_.correct(colors_.data(), colors_.data(), n);
        Random *rng = dither_ ? &random_ : nullptr;
        uint8_t *out = bytes_.data();
        for (size_t i = 0; i < n; ++i) {
            const float v[4] = {colors_[i].r, colors_[i].g, colors_[i].b, colors_[i].a};
            for (int c = 0; c < channels_; ++c) *out++ = toByte(v[order_[c]], rng);
        }
        return bytes_.data();
    }

private:
    LayerT<Color> &layer_;
    const ColorCorrectionInterface &correction_;
    Random random_;
    bool dither_;
    int channels_;
    const int *order_;
    std::vector<Color> colors_;
    std::vector<uint8_t> bytes_;
};

/// libjpeg's error manager: errors jump back to the writer instead of ending the process.
struct JPEGErrorManager {
    jpeg_error_mgr manager;
    std::jmp_buf jump;
    char text[JMSG_LENGTH_MAX];
};

[[noreturn]] void jpegErrorExit(j_common_ptr info) {
    auto *e = reinterpret_cast<JPEGErrorManager *>(info->err);
    (*info->err->format_message)(info, e->text);
    std::longjmp(e->jump, 1);
}

void jpegOutputMessage(j_common_ptr info) {
    char text[JMSG_LENGTH_MAX];
    (*info->err->format_message)(info, text);
    message(kMsgWarning, 6, "JPEGWriter: %s", text);
}

/// Compresses the layer into file; no object with a destructor lives in this frame, so the
/// error jump skips nothing. False with error filled on failure.
bool compressJPEG(std::FILE *file, int32_t width, int32_t height, ByteStrips &strips,
                  JPEGErrorManager &error) {
    jpeg_compress_struct info;
    std::memset(&info, 0, sizeof info);
    info.err = jpeg_std_error(&error.manager);
    error.manager.error_exit = jpegErrorExit;
    error.manager.output_message = jpegOutputMessage;
    if (setjmp(error.jump)) {
        jpeg_destroy_compress(&info);
        return false;
    }
    jpeg_create_compress(&info);
    jpeg_stdio_dest(&info, file);
    info.image_width = JDIMENSION(width);
    info.image_height = JDIMENSION(height);
    info.input_components = 3;
    info.in_color_space = JCS_RGB;
    jpeg_set_defaults(&info);
    jpeg_set_quality(&info, 100, TRUE);
    jpeg_start_compress(&info, TRUE);
    constexpr int32_t kStrip = 10;
    JSAMPROW rows[kStrip];
    // Strips from the top of the picture down, each handed over top row first.
    for (int32_t top = height; top > 0; top -= kStrip) {
        const int32_t n = std::min(kStrip, top), y0 = top - n;
        const uint8_t *bytes = strips.read(y0, top);
        if (!bytes) {
            std::snprintf(error.text, sizeof error.text, "the layer cannot be read");
            jpeg_destroy_compress(&info);
            return false;
        }
        for (int32_t i = 0; i < n; ++i)
            rows[i] = const_cast<JSAMPROW>(bytes + size_t(n - 1 - i) * size_t(width) * 3);
        jpeg_write_scanlines(&info, rows, JDIMENSION(n));
    }
    jpeg_finish_compress(&info);
    jpeg_destroy_compress(&info);
    return true;
}

const char *extensionOf(SaveKind kind) {
    switch (kind) {
        case kSaveEXR:
        case kSaveMultiLayerEXR:
            return ".exr";
        case kSaveJPEG:
            return ".jpg";
        case kSaveTGA32:
        case kSaveTGA24:
            return ".tga";
        default:
            return "";
    }
}

bool endsWithNoCase(const std::string &s, const std::string &tail) {
    if (tail.empty() || s.size() < tail.size()) return false;
    return std::equal(tail.begin(), tail.end(), s.end() - ptrdiff_t(tail.size()),
                      [](char a, char b) { return std::tolower(a) == std::tolower(b); });
}

/// The base name without the extension of the format (".jpeg" also counts for JPEG), with
/// "_" added when not empty.
std::string basePart(const std::string &baseName, SaveKind kind) {
    std::string base = baseName;
    const std::string ext = extensionOf(kind);
    if (endsWithNoCase(base, ext))
        base.resize(base.size() - ext.size());
    else if (kind == kSaveJPEG && endsWithNoCase(base, ".jpeg"))
        base.resize(base.size() - 5);
    return base.empty() ? base : base + "_";
}

bool writeByKind(SaveKind kind, const std::string &name, LayerT<Color> &layer,
                 const ColorCorrectionInterface &correction, bool dither) {
    switch (kind) {
        case kSaveEXR:
            return writeEXR(name, layer, true);
        case kSaveJPEG:
            return writeJPEG(name, layer, correction, dither);
        case kSaveTGA32:
            return writeTGA(name, layer, true, correction, dither);
        case kSaveTGA24:
            return writeTGA(name, layer, false, correction, dither);
        default:
            return true;
    }
}

}  // namespace

bool writeTGA(const std::string &fileName, LayerT<Color> &layer, bool withAlpha,
              const ColorCorrectionInterface &correction, bool dither) {
    const int32_t w = layer.width(), h = layer.height();
    if (w < 1 || h < 1 || w > kTGAMaxSize || h > kTGAMaxSize) {
        message(kMsgError, 6, "Cannot write %s: a TGA image of %d x %d pixels is not possible",
                fileName.c_str(), w, h);
        return false;
    }
    AtomicFile file(fileName);
    std::FILE *f = file.file();
    if (!f) {
        message(kMsgError, 6, "Could not open output file: %s", fileName.c_str());
        return false;
    }
    // ID length, colour-map type, image type 2 (true colour), colour-map layout (5 bytes), x and
    // y origin, width, height (little-endian), pixel depth and descriptor (alpha bits).
    uint8_t header[18] = {0, 0, 2};
    header[12] = uint8_t(w & 0xff);
    header[13] = uint8_t(w >> 8);
    header[14] = uint8_t(h & 0xff);
    header[15] = uint8_t(h >> 8);
    header[16] = uint8_t(withAlpha ? 32 : 24);
    header[17] = uint8_t(withAlpha ? 8 : 0);
    bool ok = std::fwrite(header, 1, sizeof header, f) == sizeof header;
    static constexpr int kBGRA[4] = {2, 1, 0, 3};
    const int channels = withAlpha ? 4 : 3;
    constexpr int32_t kStrip = 16;
    ByteStrips strips(layer, correction, dither, kStrip, channels, kBGRA);
    // The bottom row (layer row 0) comes first.
    for (int32_t y0 = 0; ok && y0 < h; y0 += kStrip) {
        const int32_t y1 = std::min(h, y0 + kStrip);
        const uint8_t *bytes = strips.read(y0, y1);
        if (!bytes) {
            message(kMsgError, 6, "Cannot write %s: layer %s cannot be read", fileName.c_str(),
                    layer.name().c_str());
            return false;
        }
        const size_t n = size_t(y1 - y0) * size_t(w) * size_t(channels);
        ok = std::fwrite(bytes, 1, n, f) == n;
    }
    if (!ok || !file.commit()) {
        message(kMsgError, 6, "Could not write output file: %s (%s)", fileName.c_str(),
                fileError().c_str());
        return false;
    }
    return true;
}

bool writeJPEG(const std::string &fileName, LayerT<Color> &layer,
               const ColorCorrectionInterface &correction, bool dither) {
    const int32_t w = layer.width(), h = layer.height();
    if (w < 1 || h < 1 || w > kJPEGMaxSize || h > kJPEGMaxSize) {
        message(kMsgError, 6,
                "JPEGWriter: cannot write %s: a JPEG image of %d x %d pixels is not possible",
                fileName.c_str(), w, h);
        return false;
    }
    AtomicFile file(fileName);
    std::FILE *f = file.file();
    if (!f) {
        message(kMsgError, 6, "JPEGWriter: Could not open output file: %s", fileName.c_str());
        return false;
    }
    static constexpr int kRGB[3] = {0, 1, 2};
    ByteStrips strips(layer, correction, dither, 10, 3, kRGB);
    JPEGErrorManager error{};
    if (!compressJPEG(f, w, h, strips, error)) {
        message(kMsgError, 6, "JPEGWriter: cannot write %s: %s", fileName.c_str(), error.text);
        return false;
    }
    if (!file.commit()) {
        message(kMsgError, 6, "JPEGWriter: could not write output file: %s (%s)", fileName.c_str(),
                fileError().c_str());
        return false;
    }
    return true;
}

std::string imageFileName(SaveKind kind, const std::string &baseName, const std::string &targetName,
                          const std::string &layerName, const std::string &outputDirectory) {
    return outputDirectory + basePart(baseName, kind) + targetName + "_" + layerName +
           extensionOf(kind);
}

std::string multiLayerFileName(const std::string &baseName, const std::string &targetName,
                               const std::string &outputDirectory) {
    return outputDirectory + basePart(baseName, kSaveMultiLayerEXR) + targetName + ".exr";
}

bool saveLayer(int32_t kind, const std::string &baseName, const std::string &targetName,
               const std::string &layerName, Frame &frame,
               const ColorCorrectionInterface &correction, bool dither,
               const std::string &outputDirectory) {
    if (kind < kSaveNone || kind > kSaveTGA24) {
        message(kMsgError, 6, "Unknown image save kind %d", kind);
        return false;
    }
    const SaveKind k = SaveKind(kind);
    if (k == kSaveNone || k == kSaveMultiLayerEXR) return true;
    if (LayerT<Color> *color = frame.getColorLayer(layerName))
        return writeByKind(k, imageFileName(k, baseName, targetName, layerName, outputDirectory),
                           *color, correction, dither);
    if (CustomFloatLayer *cf = frame.getCFLayer(layerName)) {
        const int32_t groups = (cf->channels() - 1) / 4 + 1;
        for (int32_t g = 0; g < groups; ++g) {
            ColorFromCFLayer view("temp", *cf, 4 * g);
            const std::string part = groups > 1 ? layerName + " " + std::to_string(g) : layerName;
            if (!writeByKind(k, imageFileName(k, baseName, targetName, part, outputDirectory), view,
                             correction, dither))
                return false;
        }
    }
    return true;
}

}  // namespace ox
