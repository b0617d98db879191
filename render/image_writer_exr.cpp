#include <Iex.h>
#include <ImfChannelList.h>
#include <ImfFrameBuffer.h>
#include <ImfHeader.h>
#include <ImfIO.h>
#include <ImfOutputFile.h>
#include <ImfStringAttribute.h>
#include <ImfThreading.h>
#include <ImfTiledOutputFile.h>
#include <stdio.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <set>
#include <string>
#include <vector>

#include "core/message.h"
#include "platform/file_system.h"
#include "render/image_writer.h"

namespace ox {
namespace {

/// The output stream handed to OpenEXR: writes through an open C file and raises the
/// library's I/O exception on any failure. It also remembers the failure, because OpenEXR
/// swallows exceptions raised while its file object is destroyed.
class EXROStream final : public Imf::OStream {
public:
    EXROStream(std::FILE *file, const std::string &name)
        : Imf::OStream(name.c_str()), file_(file), name_(name) {}
    void write(const char c[], int n) override {
        if (n < 0 || std::fwrite(c, 1, size_t(n), file_) != size_t(n)) fail("write to");
    }
    uint64_t tellp() override {
        const off_t p = ftello(file_);
        if (p < 0) fail("seek in");
        return uint64_t(p);
    }
    void seekp(uint64_t pos) override {
        if (fseeko(file_, off_t(pos), SEEK_SET) != 0) fail("seek in");
    }
    /// True when a write or seek failed.
    bool failed() const { return failed_; }

private:
    [[noreturn]] void fail(const char *what) {
        failed_ = true;
        throw Iex::IoExc(std::string("Failed to ") + what + " file: " + name_);
    }
    std::FILE *file_;
    std::string name_;
    bool failed_ = false;
};

/// The text of the platform's last file error.
std::string fileError() {
    const int code = FileSystemUtilities::lastError();
    return code ? std::strerror(code) : "unknown error";
}

/// The smallest power of two >= n, at most 32.
int exrTileEdge(int32_t n) {
    int e = 1;
    while (e < n && e < 32) e <<= 1;
    return e;
}

/// One layer's part of a strip of rows and the file channels that come from it.
struct LayerStrip {
    Layer *layer = nullptr;
    int32_t units = 1;                      // floats per pixel in data
    std::vector<float> data;                // the strip, units floats per pixel
    std::vector<uint8_t> bools;             // boolean layers are read here first
    std::vector<std::string> channelNames;  // one per unit used (colour: R, G, B[, A])
};

/// Reads layer rows [y0, y1) into strip.data (full width); false when the layer refuses.
bool readStrip(LayerStrip &s, int32_t width, int32_t y0, int32_t y1) {
    const Region r(0, y0, width, y1);
    switch (s.layer->kind()) {
        case kLayerBool: {
            auto &l = static_cast<LayerT<bool> &>(*s.layer);
            if (!l.read(r, reinterpret_cast<bool *>(s.bools.data()))) return false;
            const size_t n = size_t(r.area());
            for (size_t i = 0; i < n; ++i) s.data[i] = s.bools[i] ? 1.0f : 0.0f;
            return true;
        }
        case kLayerFloat:
            return static_cast<LayerT<float> &>(*s.layer).read(r, s.data.data());
        case kLayerColor:
            return static_cast<LayerT<Color> &>(*s.layer).read(
                r, reinterpret_cast<Color *>(s.data.data()));
        default:
            return static_cast<CustomFloatLayer &>(*s.layer).read(r, s.data.data());
    }
}

/// Adds the slices of a strip of layer rows [y0, y1) to fb so that file line y shows layer
/// row height - 1 - y: the base points at the file's line 0 and steps backwards.
void addSlices(Imf::FrameBuffer &fb, LayerStrip &s, int32_t width, int32_t height, int32_t y0) {
    const size_t xStride = size_t(s.units) * sizeof(float);
    const ptrdiff_t rowBytes = ptrdiff_t(width) * ptrdiff_t(xStride);
    for (size_t c = 0; c < s.channelNames.size(); ++c) {
        const uintptr_t first = reinterpret_cast<uintptr_t>(s.data.data()) + c * sizeof(float);
        const uintptr_t base = first + uintptr_t(ptrdiff_t(height - 1 - y0) * rowBytes);
        fb.insert(s.channelNames[c], Imf::Slice(Imf::FLOAT, reinterpret_cast<char *>(base), xStride,
                                                size_t(-rowBytes)));
    }
}

/// The file channels of every layer in name order; false with reason on a collision or a
/// name no file can hold.
bool planChannels(Frame &frame, bool alpha, std::vector<LayerStrip> &strips, std::string &reason) {
    std::set<std::string> seen;
    std::vector<std::string> owners;
    for (const auto &[name, layer] : frame.layers()) {
        if (name.empty()) {
            reason = "a layer has an empty name";
            return false;
        }
        LayerStrip s;
        s.layer = layer.get();
        switch (layer->kind()) {
            case kLayerColor:
                s.units = 4;
                for (const char *c : {".R", ".G", ".B", ".A"})
                    if (c[1] != 'A' || alpha) s.channelNames.push_back(name + c);
                break;
            case kLayerBool:
            case kLayerFloat:
                s.channelNames.push_back(name);
                break;
            case kLayerCustomFloat:
                s.units = static_cast<CustomFloatLayer &>(*layer).channels();
                for (int32_t i = 0; i < s.units; ++i)
                    s.channelNames.push_back(name + std::to_string(i));
                break;
            default:
                reason = "layer " + name + " is of an unknown kind";
                return false;
        }
        for (const std::string &c : s.channelNames)
            if (!seen.insert(c).second) {
                reason = "channel " + c + " of layer " + name +
                         " has the name of a channel of another layer";
                return false;
            }
        strips.push_back(std::move(s));
    }
    if (strips.empty()) {
        reason = "the frame has no layers";
        return false;
    }
    return true;
}

/// The active-tiles text: one digit per 32 x 32 tile from tile row 0 (the bottom) up, "0"
/// when the tile's mean "Z" is <= -1. Without a float "Z" every tile is active.
bool activeTiles(Frame &frame, std::string &text) {
    const int32_t w = frame.width(), h = frame.height(), t = kActiveTileSize;
    const int32_t nx = (w - 1) / t + 1, ny = (h - 1) / t + 1;
    text.assign(size_t(nx) * size_t(ny), '1');
    LayerT<float> *z = frame.getFloatLayer("Z");
    if (!z) return true;
    std::vector<float> strip(size_t(w) * size_t(t));
    for (int32_t ty = 0; ty < ny; ++ty) {
        const int32_t y0 = ty * t, y1 = std::min(h, y0 + t);
        if (!z->read(Region(0, y0, w, y1), strip.data())) return false;
        for (int32_t tx = 0; tx < nx; ++tx) {
            const int32_t x0 = tx * t, x1 = std::min(w, x0 + t);
            double sum = 0.0;
            for (int32_t y = 0; y < y1 - y0; ++y)
                for (int32_t x = x0; x < x1; ++x) sum += strip[size_t(y) * size_t(w) + size_t(x)];
            if (sum / double(int64_t(x1 - x0) * (y1 - y0)) <= -1.0)
                text[size_t(ty) * size_t(nx) + size_t(tx)] = '0';
        }
    }
    return true;
}

}  // namespace

void setImageWriterThreads(int32_t threads) {
    const int count = threads > 1 ? int(std::min<int32_t>(threads, 64)) : 0;
    // The pool is rebuilt on every change; leave it alone when the count stays.
    if (Imf::globalThreadCount() != count) Imf::setGlobalThreadCount(count);
}

bool writeMultiLayerEXR(const std::string &fileName, Frame &frame, bool alpha) {
    const int32_t w = frame.width(), h = frame.height();
    auto fail = [&](const std::string &reason) {
        message(kMsgError, 6, "Error writing exr file: %s", reason.c_str());
        return false;
    };
    if (w < 1 || h < 1) return fail(fileName + ": the frame is empty");
    std::vector<LayerStrip> strips;
    std::string reason;
    if (!planChannels(frame, alpha, strips, reason)) return fail(fileName + ": " + reason);
    std::string active;
    if (!activeTiles(frame, active)) return fail(fileName + ": the Z layer cannot be read");

    const int tw = exrTileEdge(w), th = exrTileEdge(h);
    for (LayerStrip &s : strips) {
        s.data.assign(size_t(w) * size_t(th) * size_t(s.units), 0.0f);
        if (s.layer->kind() == kLayerBool) s.bools.assign(size_t(w) * size_t(th), 0);
    }
    AtomicFile file(fileName);
    std::FILE *f = file.file();
    if (!f) return fail("Failed to open file: " + fileName + " (" + fileError() + ")");
    try {
        Imf::Header header(w, h, 1.0f, Imath::V2f(0.0f, 0.0f), 1.0f, Imf::INCREASING_Y,
                           Imf::ZIP_COMPRESSION);
        header.setTileDescription(Imf::TileDescription(tw, th, Imf::ONE_LEVEL));
        for (const LayerStrip &s : strips)
            for (const std::string &c : s.channelNames)
                header.channels().insert(c, Imf::Channel(Imf::FLOAT));
        header.insert(kActiveTilesAttribute, Imf::StringAttribute(active));
        EXROStream stream(f, fileName);
        {
            Imf::TiledOutputFile out(stream, header, Imf::globalThreadCount());
            const int nTilesX = out.numXTiles(), nTilesY = out.numYTiles();
            for (int ty = 0; ty < nTilesY; ++ty) {
                // File lines [ty * th, ty * th + rows) are layer rows [h - end, h - start).
                const int32_t start = ty * th, end = std::min(h, start + th);
                const int32_t y0 = h - end, y1 = h - start;
                Imf::FrameBuffer fb;
                for (LayerStrip &s : strips) {
                    if (!readStrip(s, w, y0, y1))
                        throw Iex::BaseExc("layer " + s.layer->name() + " cannot be read");
                    addSlices(fb, s, w, h, y0);
                }
                out.setFrameBuffer(fb);
                out.writeTiles(0, nTilesX - 1, ty, ty);
            }
        }
        if (stream.failed()) return fail("Failed to write to file: " + fileName);
    } catch (const std::exception &e) {
        return fail(e.what());
    }
    if (!file.commit())
        return fail("Failed to write to file: " + fileName + " (" + fileError() + ")");
    return true;
}

bool writeEXR(const std::string &fileName, LayerT<Color> &layer, bool alpha) {
    const int32_t w = layer.width(), h = layer.height();
    auto fail = [&](const std::string &reason) {
        message(kMsgError, 6, "Exr error: %s", reason.c_str());
        return false;
    };
    if (w < 1 || h < 1) return fail(fileName + ": the layer is empty");
    // ZIP compresses blocks of 16 lines, and the library compresses the blocks of one write
    // in parallel on its threads: each write hands over two blocks per thread (within a
    // buffer of about 32 MiB). The file is the same whatever the block count per write.
    constexpr int32_t kBlock = 16;
    constexpr int64_t kStripBytes = int64_t(32) << 20;
    const int64_t rowBytes = int64_t(w) * int64_t(sizeof(Color));
    const int64_t blocks = std::clamp<int64_t>(
        std::min<int64_t>(2 * int64_t(Imf::globalThreadCount()), kStripBytes / (rowBytes * kBlock)),
        1, 64);
    const int32_t strip = int32_t(blocks) * kBlock;
    LayerStrip s;
    s.layer = &layer;
    s.units = 4;
    s.channelNames = {"R", "G", "B"};
    if (alpha) s.channelNames.push_back("A");
    s.data.assign(size_t(w) * size_t(strip) * 4, 0.0f);
    AtomicFile file(fileName);
    std::FILE *f = file.file();
    if (!f) return fail("Failed to open file: " + fileName + " (" + fileError() + ")");
    try {
        Imf::Header header(w, h, 1.0f, Imath::V2f(0.0f, 0.0f), 1.0f, Imf::INCREASING_Y,
                           Imf::ZIP_COMPRESSION);
        for (const std::string &c : s.channelNames)
            header.channels().insert(c, Imf::Channel(Imf::FLOAT));
        EXROStream stream(f, fileName);
        {
            Imf::OutputFile out(stream, header, Imf::globalThreadCount());
            for (int32_t start = 0; start < h; start += strip) {
                const int32_t end = std::min(h, start + strip);
                const int32_t y0 = h - end, y1 = h - start;
                if (!layer.read(Region(0, y0, w, y1), reinterpret_cast<Color *>(s.data.data())))
                    throw Iex::BaseExc("layer " + layer.name() + " cannot be read");
                Imf::FrameBuffer fb;
                addSlices(fb, s, w, h, y0);
                out.setFrameBuffer(fb);
                out.writePixels(end - start);
            }
        }
        if (stream.failed()) return fail("Failed to write to file: " + fileName);
    } catch (const std::exception &e) {
        return fail(e.what());
    }
    if (!file.commit())
        return fail("Failed to write to file: " + fileName + " (" + fileError() + ")");
    return true;
}

}  // namespace ox
