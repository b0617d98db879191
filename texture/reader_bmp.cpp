// Windows bitmaps: uncompressed 24-bit BGR and 32-bit BGRA (plain or with byte-aligned bit
// fields), bottom-up (positive height) or top-down (negative height).

#include <cstring>

#include "core/message.h"
#include "texture/image_reader.h"

namespace ox {
namespace {

constexpr size_t kFileHeaderSize = 14;

bool maskShift(uint32_t mask, int &shift) {
    for (int s = 0; s < 32; s += 8)
        if (mask == (0xffu << s)) {
            shift = s;
            return true;
        }
    return false;
}

class BMPReader final : public ImageReader {
public:
    bool open(const std::string &name, const uint8_t *data, size_t size,
              const ReaderOptions &) override {
        name_ = name;
        data_ = data;
        size_ = size;
        if (size < kFileHeaderSize + 40 || data[0] != 'B' || data[1] != 'M') {
            message(kMsgError, 3, "Error opening texture %s (%s)", name.c_str(),
                    "not a Windows bitmap");
            return false;
        }
        offset_ = readLE32(data + 10);
        const uint8_t *d = data + kFileHeaderSize;
        const uint32_t headerSize = readLE32(d);
        const int32_t width = int32_t(readLE32(d + 4));
        const int32_t height = int32_t(readLE32(d + 8));
        bits_ = readLE16(d + 14);
        const uint32_t compression = readLE32(d + 16);
        if (headerSize < 40 || headerSize > size - kFileHeaderSize) return fail("bad header size");
        if (width <= 0 || height == 0 || height == INT32_MIN) return fail("bad image size");
        if (bits_ != 24 && bits_ != 32) return fail("only 24 and 32 bits per pixel are read");
        shifts_[0] = 16, shifts_[1] = 8, shifts_[2] = 0, shifts_[3] = 24;
        if (compression == 3 && bits_ == 32) {
            // Bit-field masks follow a 40-byte header or sit inside the larger ones.
            if (size < kFileHeaderSize + 40 + 12) return fail("bad bit fields");
            const uint8_t *m = d + 40;
            for (int c = 0; c < 3; ++c)
                if (!maskShift(readLE32(m + 4 * c), shifts_[c]))
                    return fail("unsupported bit fields");
            explicitAlpha_ = headerSize >= 56 && size >= kFileHeaderSize + 56 &&
                             maskShift(readLE32(m + 12), shifts_[3]);
        } else if (compression != 0) {
            return fail("compressed bitmaps are not read");
        }
        topDown_ = height < 0;
        info_.width = width;
        info_.height = topDown_ ? -height : height;
        info_.bitsPerChannel = 8;
        info_.alpha = bits_ == 32;
        return true;
    }

    bool readPixels(TexelBuffer &out, const ReadLimits &limits) override {
        const uint64_t rowBytes = (uint64_t(info_.width) * (bits_ / 8) + 3) & ~uint64_t(3);
        // Compared by division: rowBytes x height may not fit in 64 bits.
        if (offset_ > size_ || uint64_t(info_.height) > (size_ - offset_) / rowBytes) {
            message(kMsgError, 3, "getPixels() failed for image %s", name_.c_str());
            return false;
        }
        if (!out.allocate(name_, info_.width, info_.height, nativeFormat(), limits.maxImageBytes))
            return false;
        const int bpp = bits_ / 8;
        bool anyAlpha = false;
        for (int32_t y = 0; y < info_.height; ++y) {
            const uint8_t *src = data_ + offset_ + size_t(y) * rowBytes;
            uint8_t *dst = out.row(y);
            for (int32_t x = 0; x < info_.width; ++x, src += bpp, dst += bpp) {
                if (bpp == 3) {
                    dst[0] = src[2], dst[1] = src[1], dst[2] = src[0];
                } else {
                    const uint32_t v = readLE32(src);
                    for (int c = 0; c < 4; ++c) dst[c] = uint8_t(v >> shifts_[c]);
                    anyAlpha |= dst[3] != 0;
                }
            }
        }
        // Plain 32-bit bitmaps usually leave the fourth byte at zero: it is not alpha then.
        if (bpp == 4 && !anyAlpha && !explicitAlpha_)
            for (int32_t y = 0; y < info_.height; ++y)
                for (int32_t x = 0; x < info_.width; ++x) out.row(y)[x * 4 + 3] = 255;
        if (topDown_) out.flipRows();
        return true;
    }

private:
    bool fail(const char *why) {
        message(kMsgError, 3, "Error opening texture %s (%s)", name_.c_str(), why);
        return false;
    }

    const uint8_t *data_ = nullptr;
    size_t size_ = 0;
    uint32_t offset_ = 0;
    int bits_ = 0;
    int shifts_[4] = {};
    bool topDown_ = false, explicitAlpha_ = false;
};

class BMPFactory final : public IRFactory {
public:
    std::unique_ptr<ImageReader> create() const override { return std::make_unique<BMPReader>(); }
};

}  // namespace

std::unique_ptr<IRFactory> makeBMPFactory() { return std::make_unique<BMPFactory>(); }

}  // namespace ox
