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
#include <ImfVersion.h>

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
        if (!headersFit(data, size)) {
            message(kMsgError, 3, "Error reading EXRFile: %s", name.c_str());
            return false;
        }
        try {
            ExrMemoryStream stream(name, data, size);
            stream.seekg(8);
            int version = int(readLE32(data + 4));
            header_.readFrom(stream, version);
            const Imf::Header &header = header_;
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
        if (!chunksFit(limits)) {
            message(kMsgError, 3, "Error reading EXRFile: %s", name_.c_str());
            out.clear();
            return false;
        }
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
    /// Walks the attribute lists of the file's headers (name, type, size, value; an empty name
    /// ends a header, and an empty header the list of a multi-part file): every size must lie
    /// within the file before the library is allowed to allocate by it.
    static bool headersFit(const uint8_t *data, size_t size) {
        if (size < 8 || readLE32(data) != uint32_t(Imf::MAGIC)) return false;
        const uint32_t version = readLE32(data + 4);
        if (Imf::isNonImage(int(version))) return false;  // deep data are not textures
        ByteReader in(data, size);
        in.seek(8);
        auto readName = [&](std::string &text) {
            text.clear();
            for (uint8_t c; in.byte(c);) {
                if (c == 0) return true;
                if (text.size() >= 255) return false;
                text += char(c);
            }
            return false;
        };
        std::string attr, type;
        for (int header = 0;; ++header) {
            bool first = true;
            for (;;) {
                if (!readName(attr)) return false;
                if (attr.empty()) break;
                first = false;
                uint8_t sz[4];
                if (!readName(type) || !in.read(sz, 4)) return false;
                const uint32_t n = readLE32(sz);
                if (n > in.remaining() || !in.take(n)) return false;
            }
            if (first) return header > 0;  // the empty header that ends a multi-part list
            if (!Imf::isMultiPart(int(version))) return true;
        }
    }

    /// The library sizes its chunk table by the image's height (or tile count) and its buffers
    /// by a chunk's width times every channel of the file: both are checked against the file's
    /// length and the image limit first.
    bool chunksFit(const ReadLimits &limits) const {
        const Imath::Box2i dw = header_.dataWindow();
        const uint64_t w = uint64_t(int64_t(dw.max.x) - dw.min.x + 1);
        const uint64_t h = uint64_t(int64_t(dw.max.y) - dw.min.y + 1);
        uint64_t lineBytes = 0;
        for (auto it = header_.channels().begin(); it != header_.channels().end(); ++it)
            lineBytes += (it.channel().type == Imf::HALF ? 2 : 4) * w;
        uint64_t chunks, chunkLines;
        if (header_.hasTileDescription()) {
            const Imf::TileDescription &td = header_.tileDescription();
            if (td.xSize == 0 || td.ySize == 0) return false;
            chunks = ((w + td.xSize - 1) / td.xSize) * ((h + td.ySize - 1) / td.ySize);
            chunkLines = td.ySize;
            lineBytes = lineBytes / w * std::min<uint64_t>(w, td.xSize);
        } else {
            chunks = (h + 255) / 256;  // no compression packs more lines into one chunk
            chunkLines = std::min<uint64_t>(h, 256);
        }
        return chunks <= size_ / 8 && lineBytes <= limits.maxImageBytes / chunkLines;
    }

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
    Imf::Header header_;
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
