// OpenEXR: scan-line and tiled files, half and float (and unsigned int) channels; R, G, B, A,
// a luminance Y or one lone channel, optionally inside a layer ("beauty.R"). Tiled multi-layer
// files written by this system carry the active-tiles attribute; only their active tiles are
// read, the others stay empty. Every library exception is caught here.

#include <Iex.h>
#include <ImfChannelList.h>
#include <ImfFrameBuffer.h>
#include <ImfHeader.h>
#include <ImfIO.h>
#include <ImfInputFile.h>
#include <ImfStringAttribute.h>
#include <ImfTiledInputFile.h>

#include <algorithm>
#include <cstring>
#include <exception>
#include <vector>

#include "core/message.h"
#include "texture/exr_memory_stream.h"
#include "texture/image_reader.h"

namespace ox {
namespace {

constexpr const char *kActiveTilesAttribute = "QUENDAL_ACTIVETILES_PLAIN_TEXT";
constexpr int kActiveTileSize = 32;

class ExrReader final : public ImageReader {
public:
    bool open(const std::string &name, const uint8_t *data, size_t size,
              const ReaderOptions &options) override {
        name_ = name;
        data_ = data;
        size_ = size;
        try {
            ExrMemoryStream stream(name, data, size);
            Imf::InputFile file(stream);
            const Imf::Header &header = file.header();
            const Imath::Box2i dw = header.dataWindow();
            const int64_t w = int64_t(dw.max.x) - dw.min.x + 1,
                          h = int64_t(dw.max.y) - dw.min.y + 1;
            if (w <= 0 || h <= 0 || w > INT32_MAX || h > INT32_MAX) {
                message(kMsgError, 3, "Error reading EXRFile: %s", name.c_str());
                return false;
            }
            const std::string prefix = options.layer.empty() ? "" : options.layer + ".";
            const Imf::ChannelList &list = header.channels();
            auto has = [&](const std::string &c) { return list.findChannel(c) != nullptr; };
            if (!options.layer.empty()) {
                bool anyInLayer = false;
                for (auto it = list.begin(); it != list.end(); ++it)
                    anyInLayer |= std::string(it.name()).rfind(prefix, 0) == 0;
                if (!anyInLayer) {
                    message(kMsgError, 3, "Error reading layer in EXRFile: %s", name.c_str());
                    return false;
                }
            }
            channels_.clear();
            if (has(prefix + "R") || has(prefix + "G") || has(prefix + "B")) {
                for (const char *c : {"R", "G", "B"}) {
                    if (!has(prefix + c)) {
                        message(kMsgError, 3, "Missing channel %s in OpenEXR file: %s",
                                (prefix + c).c_str(), name.c_str());
                        return false;
                    }
                    channels_.push_back(prefix + c);
                }
            } else if (has(prefix + "Y")) {
                channels_.push_back(prefix + "Y");
            } else {
                // A file (or layer) of one channel of any name is read as grey.
                std::vector<std::string> inLayer;
                for (auto it = list.begin(); it != list.end(); ++it)
                    if (std::string(it.name()).rfind(prefix, 0) == 0) inLayer.push_back(it.name());
                if (inLayer.size() != 1) {
                    message(kMsgError, 3, "Missing channel %s in OpenEXR file: %s",
                            (prefix + "R").c_str(), name.c_str());
                    return false;
                }
                channels_.push_back(inLayer[0]);
            }
            const bool alpha = has(prefix + "A") && channels_[0] != prefix + "A";
            if (alpha) channels_.push_back(prefix + "A");
            bool allHalf = true;
            for (const std::string &c : channels_)
                allHalf &= list.findChannel(c)->type == Imf::HALF;
            info_.width = int32_t(w);
            info_.height = int32_t(h);
            info_.bitsPerChannel = allHalf ? 16 : 32;
            info_.isFloat = true;
            info_.grey = channels_.size() <= 2;
            info_.alpha = alpha;
            minX_ = dw.min.x;
            minY_ = dw.min.y;
            tiled_ = header.hasTileDescription();
            if (tiled_ && !options.layer.empty()) {
                const auto *attr =
                    header.findTypedAttribute<Imf::StringAttribute>(kActiveTilesAttribute);
                if (!attr) {
                    message(kMsgWarning, 3,
                            "No OpenEXR meta-data in file %s, required for optimized reading",
                            name.c_str());
                } else {
                    activeTiles_ = attr->value();
                    const int64_t cols = (w - 1) / kActiveTileSize + 1;
                    const int64_t rows = (h - 1) / kActiveTileSize + 1;
                    const bool digits = activeTiles_.find_first_not_of("01") == std::string::npos;
                    if (!digits || int64_t(activeTiles_.size()) != cols * rows) {
                        message(kMsgWarning, 3,
                                "Error reading OpenEXR meta-data required for optimized reading : "
                                "%s",
                                name.c_str());
                        activeTiles_.clear();
                    }
                }
            }
            if (activeTiles_.empty())
                message(kMsgDebug, 3, "Using non tiled interface for texture %s", name.c_str());
            return true;
        } catch (const std::exception &e) {
            message(kMsgError, 3, "Error reading EXRFile: %s", e.what());
            return false;
        }
    }

    bool readPixels(TexelBuffer &out, const ReadLimits &limits) override {
        if (!out.allocate(name_, info_.width, info_.height, nativeFormat(), limits.maxImageBytes))
            return false;
        try {
            ExrMemoryStream stream(name_, data_, size_);
            const Imf::PixelType type = info_.bitsPerChannel == 16 ? Imf::HALF : Imf::FLOAT;
            const size_t cb = size_t(out.format().bytesPerChannel());
            const size_t xStride = size_t(out.format().bytesPerTexel());
            // EXR rows run top-down: file row minY goes to the buffer's top row and each later
            // row one below, through a negative row stride (the library's strides are unsigned
            // and wrap, which is how it takes negative ones).
            const ptrdiff_t rowBytes = ptrdiff_t(out.rowBytes());
            const uintptr_t top = reinterpret_cast<uintptr_t>(out.row(info_.height - 1));
            Imf::FrameBuffer fb;
            for (size_t c = 0; c < channels_.size(); ++c) {
                const uintptr_t base = top + c * cb -
                                       uintptr_t(ptrdiff_t(minX_) * ptrdiff_t(xStride)) +
                                       uintptr_t(ptrdiff_t(minY_) * rowBytes);
                fb.insert(channels_[c], Imf::Slice(type, reinterpret_cast<char *>(base), xStride,
                                                   size_t(-rowBytes)));
            }
            if (activeTiles_.empty()) {
                Imf::InputFile file(stream);
                file.setFrameBuffer(fb);
                file.readPixels(minY_, minY_ + info_.height - 1);
                return true;
            }
            std::memset(out.data(), 0, size_t(out.sizeBytes()));
            Imf::TiledInputFile file(stream);
            file.setFrameBuffer(fb);
            for (int ty = 0; ty < file.numYTiles(0); ++ty)
                for (int tx = 0; tx < file.numXTiles(0); ++tx) {
                    const Imath::Box2i box = file.dataWindowForTile(tx, ty, 0);
                    if (tileActive(box)) file.readTile(tx, ty, 0);
                }
            return true;
        } catch (const std::exception &e) {
            message(kMsgError, 3, "Error reading EXRFile: %s", e.what());
            return false;
        }
    }

private:
    /// True when any active-tiles cell (counted from the bottom row of the picture) overlaps the
    /// file's tile.
    bool tileActive(const Imath::Box2i &box) const {
        const int64_t cols = (int64_t(info_.width) - 1) / kActiveTileSize + 1;
        const int64_t x0 = (int64_t(box.min.x) - minX_) / kActiveTileSize;
        const int64_t x1 = (int64_t(box.max.x) - minX_) / kActiveTileSize;
        // File row r is picture row height - 1 - r counted from the bottom.
        const int64_t y0 =
            (int64_t(info_.height) - 1 - (int64_t(box.max.y) - minY_)) / kActiveTileSize;
        const int64_t y1 =
            (int64_t(info_.height) - 1 - (int64_t(box.min.y) - minY_)) / kActiveTileSize;
        for (int64_t y = y0; y <= y1; ++y)
            for (int64_t x = x0; x <= x1; ++x)
                if (activeTiles_[size_t(y * cols + x)] == '1') return true;
        return false;
    }

    const uint8_t *data_ = nullptr;
    size_t size_ = 0;
    std::vector<std::string> channels_;
    std::string activeTiles_;
    int minX_ = 0, minY_ = 0;
    bool tiled_ = false;
};

class SimpleExrFactory final : public IRFactory {
public:
    std::unique_ptr<ImageReader> create() const override { return std::make_unique<ExrReader>(); }
};

}  // namespace

std::unique_ptr<IRFactory> makeSimpleExrFactory() { return std::make_unique<SimpleExrFactory>(); }

}  // namespace ox
