#include "texture/texture_cache.h"

#include <ImfChannelList.h>
#include <ImfFrameBuffer.h>
#include <ImfHeader.h>
#include <ImfIntAttribute.h>
#include <ImfStringAttribute.h>
#include <ImfTiledInputFile.h>
#include <ImfTiledOutputFile.h>
#include <sys/stat.h>

#include <cstdio>
#include <exception>
#include <filesystem>

#include "core/message.h"
#include "platform/file_system.h"
#include "texture/exr_memory_stream.h"

namespace ox {
namespace {

constexpr int kCacheTileSize = 64;

/// 64-bit FNV-1a.
uint64_t hashText(const std::string &s) {
    uint64_t h = 1469598103934665603ull;
    for (unsigned char c : s) h = (h ^ c) * 1099511628211ull;
    return h;
}

/// Size and modification time of a file, as text; empty when it cannot be seen.
bool sourceStamp(const std::string &path, std::string &size, std::string &mtime) {
    struct stat st;
    if (::stat(path.c_str(), &st) != 0) return false;
    size = std::to_string(static_cast<long long>(st.st_size));
    mtime = std::to_string(static_cast<long long>(st.st_mtim.tv_sec)) + "." +
            std::to_string(static_cast<long long>(st.st_mtim.tv_nsec));
    return true;
}

std::string absolutePath(const std::string &path) {
    std::error_code ec;
    std::filesystem::path p = std::filesystem::absolute(path, ec);
    return ec ? path : p.lexically_normal().string();
}

const char *yesNo(bool b, const char *yes, const char *no) { return b ? yes : no; }

void insertRGBA(Imf::FrameBuffer &fb, TexelBuffer &b, int minusX, int minusY) {
    const Imf::PixelType type = b.format().type == TexelType::kF16 ? Imf::HALF : Imf::FLOAT;
    const size_t cb = size_t(b.format().bytesPerChannel()), xs = size_t(b.format().bytesPerTexel());
    const char *names[4] = {"R", "G", "B", "A"};
    for (int c = 0; c < 4; ++c) {
        char *base = reinterpret_cast<char *>(b.data()) + c * cb - ptrdiff_t(minusX) * xs -
                     ptrdiff_t(minusY) * ptrdiff_t(b.rowBytes());
        fb.insert(names[c], Imf::Slice(type, base, xs, b.rowBytes()));
    }
}

}  // namespace

TextureCache::TextureCache(std::string directory, bool readOnly)
    : directory_(std::move(directory)), readOnly_(readOnly) {
    if (!directory_.empty() && directory_.back() != '/') directory_ += '/';
}

std::string TextureCache::cacheFileName(const std::string &source,
                                        const ReaderOptions &options) const {
    char hex[17];
    std::snprintf(
        hex, sizeof hex, "%016llx",
        static_cast<unsigned long long>(hashText(absolutePath(source) + "\n" + options.key())));
    return directory_ + hex + ".exr";
}

TextureCache::Result TextureCache::load(const std::string &source, const ReaderOptions &options,
                                        MipImage &image, uint64_t maxBytes) const {
    const std::string file = cacheFileName(source, options);
    if (!FileSystemUtilities::exists(file)) return Result::kMissing;
    std::string size, mtime;
    if (!sourceStamp(source, size, mtime)) return Result::kMissing;
    std::string bytes;
    if (!FileSystemUtilities::readFile(file, bytes, size_t(maxBytes) * 2)) {
        message(kMsgWarning, 3, "Can't read %s using tiled interface", file.c_str());
        return Result::kDamaged;
    }
    try {
        ExrMemoryStream stream(file, reinterpret_cast<const uint8_t *>(bytes.data()), bytes.size());
        Imf::TiledInputFile in(stream);
        const Imf::Header &h = in.header();
        const auto *version = h.findTypedAttribute<Imf::IntAttribute>("TCVersion");
        if (!version || version->value() != kTextureCacheVersion) {
            message(kMsgWarning, 3, "Incorrect cache version in file %s", file.c_str());
            return Result::kDamaged;
        }
        const auto *bpc = h.findTypedAttribute<Imf::IntAttribute>("TCSourceBPC");
        const auto *hdr = h.findTypedAttribute<Imf::IntAttribute>("TCSourceHDR");
        const auto *layout = h.findTypedAttribute<Imf::IntAttribute>("TCSourceLayout");
        const auto *srcSize = h.findTypedAttribute<Imf::StringAttribute>("TCSourceSize");
        const auto *srcTime = h.findTypedAttribute<Imf::StringAttribute>("TCSourceMTime");
        if (!bpc || !hdr || !layout || !srcSize || !srcTime ||
            h.tileDescription().mode != Imf::MIPMAP_LEVELS ||
            h.tileDescription().roundingMode != Imf::ROUND_DOWN) {
            message(kMsgWarning, 3, "Can't read %s using tiled interface", file.c_str());
            return Result::kDamaged;
        }
        // A copy of an older version of the source is simply out of date.
        if (srcSize->value() != size || srcTime->value() != mtime) return Result::kMissing;
        const int layoutValue = layout->value();
        TexelFormat native{TexelType(layoutValue / 8), uint8_t(layoutValue % 8)};
        if (layoutValue < 0 || layoutValue / 8 > int(TexelType::kF32) || native.channels < 1 ||
            native.channels > 4) {
            message(kMsgWarning, 3, "Can't read %s using tiled interface", file.c_str());
            return Result::kDamaged;
        }
        const Imath::Box2i dw = h.dataWindow();
        const int64_t w = int64_t(dw.max.x) - dw.min.x + 1, ht = int64_t(dw.max.y) - dw.min.y + 1;
        if (w <= 0 || ht <= 0 || w > INT32_MAX || ht > INT32_MAX) {
            message(kMsgWarning, 3, "Can't read %s using tiled interface", file.c_str());
            return Result::kDamaged;
        }
        message(kMsgDebug, 3, "Using tiled interface for texture %s", source.c_str());
        message(kMsgDebug, 3, "Creating Tiled texture from %s with %dx%d, %d bpc, %s and %s\n",
                source.c_str(), int(w), int(ht), bpc->value(),
                yesNo(native.isGrey(), "grayscale", "color"),
                yesNo(native.hasAlpha(), "alpha", "no alpha"));
        const TexelFormat stored{native.type == TexelType::kU8 || native.type == TexelType::kF16
                                     ? TexelType::kF16
                                     : TexelType::kF32,
                                 4};
        std::vector<TexelBuffer> levels;
        for (int l = 0; l < in.numLevels(); ++l) {
            TexelBuffer raw;
            if (!raw.allocate(file, in.levelWidth(l), in.levelHeight(l), stored, maxBytes))
                return Result::kDamaged;
            Imf::FrameBuffer fb;
            const Imath::Box2i lw = in.dataWindowForLevel(l);
            insertRGBA(fb, raw, lw.min.x, lw.min.y);
            in.setFrameBuffer(fb);
            try {
                in.readTiles(0, in.numXTiles(l) - 1, 0, in.numYTiles(l) - 1, l);
            } catch (const std::exception &) {
                message(kMsgWarning, 3,
                        "Error reading tile in Tiled EXR file, please rebuild the file %s",
                        file.c_str());
                return Result::kDamaged;
            }
            raw.flipRows();
            if (raw.format() == native) {
                levels.push_back(std::move(raw));
            } else {
                TexelBuffer converted;
                if (!raw.convertTo(file, native, converted, maxBytes)) return Result::kDamaged;
                levels.push_back(std::move(converted));
            }
        }
        if (!image.adopt(source, std::move(levels), hdr->value() != 0, bpc->value())) {
            message(kMsgWarning, 3, "Can't read %s using tiled interface", file.c_str());
            return Result::kDamaged;
        }
        return Result::kLoaded;
    } catch (const std::exception &) {
        message(kMsgWarning, 3, "Can't read %s using tiled interface", file.c_str());
        return Result::kDamaged;
    }
}

bool TextureCache::store(const std::string &source, const ReaderOptions &options,
                         const MipImage &image) const {
    if (readOnly_ || image.levelCount() == 0) return false;
    const std::string file = cacheFileName(source, options);
    std::string size, mtime;
    if (!sourceStamp(source, size, mtime)) return false;
    if (!FileSystemUtilities::createDirectories(directory_)) {
        message(kMsgWarning, 3, "Cannot create the texture cache directory %s", directory_.c_str());
        return false;
    }
    const TexelFormat native = image.level(0).format();
    const TexelFormat stored{native.type == TexelType::kU8 || native.type == TexelType::kF16
                                 ? TexelType::kF16
                                 : TexelType::kF32,
                             4};
    AtomicFile out(file);
    const std::string &temp = out.tempPath();
    if (temp.empty()) return false;
    try {
        Imf::Header h(image.width(), image.height());
        h.compression() = Imf::ZIP_COMPRESSION;
        const Imf::PixelType type = stored.type == TexelType::kF16 ? Imf::HALF : Imf::FLOAT;
        for (const char *c : {"R", "G", "B", "A"}) h.channels().insert(c, Imf::Channel(type));
        h.setTileDescription(Imf::TileDescription(kCacheTileSize, kCacheTileSize,
                                                  Imf::MIPMAP_LEVELS, Imf::ROUND_DOWN));
        h.insert("TCVersion", Imf::IntAttribute(kTextureCacheVersion));
        h.insert("TCSourceBPC", Imf::IntAttribute(image.sourceBitsPerChannel()));
        h.insert("TCSourceHDR", Imf::IntAttribute(image.isHDR() ? 1 : 0));
        h.insert("TCSourceLayout", Imf::IntAttribute(int(native.type) * 8 + native.channels));
        h.insert("TCSourceSize", Imf::StringAttribute(size));
        h.insert("TCSourceMTime", Imf::StringAttribute(mtime));
        {
            Imf::TiledOutputFile exr(temp.c_str(), h);
            if (exr.numLevels() != image.levelCount()) return false;
            for (int l = 0; l < image.levelCount(); ++l) {
                TexelBuffer level;
                if (!image.level(l).convertTo(file, stored, level, UINT64_MAX)) return false;
                level.flipRows();
                Imf::FrameBuffer fb;
                insertRGBA(fb, level, 0, 0);
                exr.setFrameBuffer(fb);
                exr.writeTiles(0, exr.numXTiles(l) - 1, 0, exr.numYTiles(l) - 1, l);
            }
        }
    } catch (const std::exception &e) {
        message(kMsgWarning, 3, "Failed to write cached texture for file %s (%s)", source.c_str(),
                e.what());
        return false;
    }
    if (!out.commit()) {
        message(kMsgWarning, 3, "Failed to write cached texture for file %s", source.c_str());
        return false;
    }
    return true;
}

}  // namespace ox
