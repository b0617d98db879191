// Truevision TGA: uncompressed and run-length encoded true colour (24/32 bits) and grey
// (8 bits, 16 bits = grey + alpha), bottom-up or top-down, with or without the 2.0 footer.

#include <algorithm>
#include <cstring>

#include "core/message.h"
#include "texture/image_reader.h"

namespace ox {
namespace {

constexpr size_t kHeaderSize = 18;
constexpr size_t kFooterSize = 26;
constexpr const char kFooterSignature[] = "TRUEVISION-XFILE";

class TGAReader final : public ImageReader {
public:
    bool open(const std::string &name, const uint8_t *data, size_t size,
              const ReaderOptions &) override {
        name_ = name;
        data_ = data;
        size_ = size;
        if (size < kHeaderSize) {
            message(kMsgError, 3, "Cannot open tga file %s", name.c_str());
            return false;
        }
        const uint8_t *h = data;
        const int idLength = h[0], colorMapType = h[1];
        imageType_ = h[2];
        const int width = readLE16(h + 12), height = readLE16(h + 14);
        bitsPerPixel_ = h[16];
        descriptor_ = h[17];
        if (colorMapType != 0 || imageType_ == 1 || imageType_ == 9) {
            message(kMsgError, 3, "Cannot read tga file %s since it has a colormap", name.c_str());
            return false;
        }
        if (imageType_ != 2 && imageType_ != 3 && imageType_ != 10 && imageType_ != 11) {
            message(kMsgError, 3, "Unsupported image format in tga file %s (imageType = %d)",
                    name.c_str(), imageType_);
            return false;
        }
        const bool grey = imageType_ == 3 || imageType_ == 11;
        const bool ok = grey ? (bitsPerPixel_ == 8 || bitsPerPixel_ == 16)
                             : (bitsPerPixel_ == 24 || bitsPerPixel_ == 32);
        if (!ok) {
            message(kMsgError, 3, "Unsupported pixel format (%d bits per pixel) in tga file %s",
                    bitsPerPixel_, name.c_str());
            return false;
        }
        if (width == 0 || height == 0) {
            message(kMsgError, 3, "Cannot open tga file %s", name.c_str());
            return false;
        }
        // With the 2.0 footer the pixel data end where the extension area or the footer starts.
        end_ = size;
        if (size >= kHeaderSize + kFooterSize &&
            std::memcmp(data + size - kFooterSize + 8, kFooterSignature,
                        sizeof kFooterSignature - 1) == 0) {
            end_ = size - kFooterSize;
            const uint32_t extension = readLE32(data + size - kFooterSize);
            const uint32_t developer = readLE32(data + size - kFooterSize + 4);
            if (extension >= kHeaderSize && extension < end_) end_ = extension;
            if (developer >= kHeaderSize && developer < end_) end_ = developer;
        }
        start_ = kHeaderSize + size_t(idLength);
        if (start_ > end_) {
            message(kMsgError, 3, "Cannot open tga file %s", name.c_str());
            return false;
        }
        info_.width = width;
        info_.height = height;
        info_.bitsPerChannel = 8;
        info_.grey = grey;
        info_.alpha = bitsPerPixel_ == 16 || bitsPerPixel_ == 32;
        return true;
    }

    bool readPixels(TexelBuffer &out, const ReadLimits &limits) override {
        const size_t bpp = size_t(bitsPerPixel_) / 8;
        const uint64_t texels = uint64_t(info_.width) * uint64_t(info_.height);
        const uint64_t available = end_ - start_;
        const bool rle = imageType_ >= 9;
        // A run packet of 1 + bpp bytes gives at most 128 texels.
        if ((!rle && texels * bpp > available) || (rle && texels > available / (1 + bpp) * 128)) {
            message(kMsgError, 3, "Unable to read tga file %s: the file is too short for %dx%d",
                    name_.c_str(), info_.width, info_.height);
            return false;
        }
        if (!out.allocate(name_, info_.width, info_.height, nativeFormat(), limits.maxImageBytes))
            return false;
        ByteReader in(data_ + start_, size_t(available));
        uint8_t *dst = out.data();
        if (!rle) {
            for (uint64_t i = 0; i < texels; ++i) swizzle(in.take(bpp), dst + i * bpp, bpp);
        } else {
            uint64_t i = 0;
            while (i < texels) {
                uint8_t packet;
                if (!in.byte(packet)) return truncated();
                // Runs may continue onto the next row (common writers do this) but never past
                // the last texel of the image.
                const uint64_t count = std::min<uint64_t>((packet & 0x7f) + 1, texels - i);
                if (packet & 0x80) {
                    const uint8_t *p = in.take(bpp);
                    if (!p) return truncated();
                    for (uint64_t k = 0; k < count; ++k) swizzle(p, dst + (i + k) * bpp, bpp);
                } else {
                    const uint8_t *p = in.take(count * bpp);
                    if (!p) return truncated();
                    for (uint64_t k = 0; k < count; ++k)
                        swizzle(p + k * bpp, dst + (i + k) * bpp, bpp);
                }
                i += count;
            }
        }
        if (descriptor_ & 0x20) out.flipRows();  // top-left origin
        if (descriptor_ & 0x10) mirrorColumns(out, bpp);
        return true;
    }

private:
    bool truncated() {
        message(kMsgError, 3, "Unable to read tga file %s: run-length data end early",
                name_.c_str());
        return false;
    }
    static void swizzle(const uint8_t *src, uint8_t *dst, size_t bpp) {
        if (bpp >= 3) {
            dst[0] = src[2], dst[1] = src[1], dst[2] = src[0];
            if (bpp == 4) dst[3] = src[3];
        } else {
            std::memcpy(dst, src, bpp);
        }
    }
    static void mirrorColumns(TexelBuffer &out, size_t bpp) {
        for (int32_t y = 0; y < out.height(); ++y) {
            uint8_t *r = out.row(y);
            for (int32_t a = 0, b = out.width() - 1; a < b; ++a, --b)
                std::swap_ranges(r + a * bpp, r + (a + 1) * bpp, r + b * bpp);
        }
    }

    const uint8_t *data_ = nullptr;
    size_t size_ = 0, start_ = 0, end_ = 0;
    int imageType_ = 0, bitsPerPixel_ = 0, descriptor_ = 0;
};

class TGAFactory final : public IRFactory {
public:
    std::unique_ptr<ImageReader> create() const override { return std::make_unique<TGAReader>(); }
};

}  // namespace

std::unique_ptr<IRFactory> makeTGAFactory() { return std::make_unique<TGAFactory>(); }

}  // namespace ox
