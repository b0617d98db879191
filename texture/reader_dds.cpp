// DirectDraw surfaces: two-dimensional DXT1 to DXT5 block-compressed images, decoded to
// 8-bit RGBA. Only the first (largest) level is read; the mip chain is rebuilt on load.

#include <cstring>

#include "core/message.h"
#include "texture/image_reader.h"

namespace ox {
namespace {

constexpr size_t kDataOffset = 128;  // magic + 124-byte header
constexpr uint32_t kPixelFormatFourCC = 0x4;
constexpr uint32_t kCaps2CubeMap = 0x200;
constexpr uint32_t kCaps2Volume = 0x200000;
constexpr uint32_t kFlagDepth = 0x800000;

uint32_t fourCC(const char *s) { return readLE32(reinterpret_cast<const uint8_t *>(s)); }

void color565(uint16_t c, uint8_t *out) {
    const int r = (c >> 11) & 31, g = (c >> 5) & 63, b = c & 31;
    out[0] = uint8_t((r << 3) | (r >> 2));
    out[1] = uint8_t((g << 2) | (g >> 4));
    out[2] = uint8_t((b << 3) | (b >> 2));
    out[3] = 255;
}

/// Decodes a colour block into 16 RGBA texels; threeColour allows the DXT1 mode with
/// transparent black.
void decodeColorBlock(const uint8_t *b, uint8_t texels[16][4], bool threeColour) {
    uint8_t pal[4][4];
    const uint16_t c0 = readLE16(b), c1 = readLE16(b + 2);
    color565(c0, pal[0]);
    color565(c1, pal[1]);
    if (c0 > c1 || !threeColour) {
        for (int i = 0; i < 3; ++i) {
            pal[2][i] = uint8_t((2 * pal[0][i] + pal[1][i] + 1) / 3);
            pal[3][i] = uint8_t((pal[0][i] + 2 * pal[1][i] + 1) / 3);
        }
        pal[2][3] = pal[3][3] = 255;
    } else {
        for (int i = 0; i < 3; ++i) pal[2][i] = uint8_t((pal[0][i] + pal[1][i]) / 2);
        pal[2][3] = 255;
        pal[3][0] = pal[3][1] = pal[3][2] = pal[3][3] = 0;
    }
    const uint32_t bits = readLE32(b + 4);
    for (int i = 0; i < 16; ++i) std::memcpy(texels[i], pal[(bits >> (2 * i)) & 3], 4);
}

void decodeExplicitAlpha(const uint8_t *b, uint8_t texels[16][4]) {
    for (int i = 0; i < 16; ++i) {
        const int nibble = (b[i / 2] >> (4 * (i & 1))) & 15;
        texels[i][3] = uint8_t(nibble * 17);
    }
}

void decodeInterpolatedAlpha(const uint8_t *b, uint8_t texels[16][4]) {
    int a[8];
    a[0] = b[0], a[1] = b[1];
    if (a[0] > a[1]) {
        for (int i = 1; i < 7; ++i) a[i + 1] = ((7 - i) * a[0] + i * a[1] + 3) / 7;
    } else {
        for (int i = 1; i < 5; ++i) a[i + 1] = ((5 - i) * a[0] + i * a[1] + 2) / 5;
        a[6] = 0, a[7] = 255;
    }
    uint64_t bits = 0;
    for (int i = 0; i < 6; ++i) bits |= uint64_t(b[2 + i]) << (8 * i);
    for (int i = 0; i < 16; ++i) texels[i][3] = uint8_t(a[(bits >> (3 * i)) & 7]);
}

class DDSReader final : public ImageReader {
public:
    bool open(const std::string &name, const uint8_t *data, size_t size,
              const ReaderOptions &) override {
        name_ = name;
        data_ = data;
        size_ = size;
        if (size < 4) {
            message(kMsgError, 3, "Failed to open DDS file");
            return false;
        }
        if (std::memcmp(data, "DDS ", 4) != 0) {
            message(kMsgError, 3, "Invalid Magic Number in DDS file (%s)", name.c_str());
            return false;
        }
        if (size < kDataOffset) {
            message(kMsgError, 3, "Failed to open DDS file");
            return false;
        }
        const uint8_t *h = data + 4;
        const uint32_t headerSize = readLE32(h), flags = readLE32(h + 4);
        if (headerSize != 124) {
            message(kMsgError, 3, "Invalid header size in DDS file (%d)", int(headerSize));
            return false;
        }
        const uint32_t height = readLE32(h + 8), width = readLE32(h + 12);
        const uint32_t depth = readLE32(h + 20);
        const uint8_t *pf = h + 72;
        if (readLE32(pf) != 32) {
            message(kMsgError, 3, "Invalid pixel format structure size in DDS header (%d)",
                    int(readLE32(pf)));
            return false;
        }
        if (!(readLE32(pf + 4) & kPixelFormatFourCC)) {
            message(kMsgError, 3, "Reading of non compressed DDS files not supported");
            return false;
        }
        const uint32_t caps2 = readLE32(h + 108);
        if ((caps2 & (kCaps2CubeMap | kCaps2Volume)) || ((flags & kFlagDepth) && depth > 1)) {
            message(kMsgError, 3, "Volume and cube map DDS files not supported");
            return false;
        }
        const uint32_t cc = readLE32(pf + 8);
        if (cc == fourCC("DXT1"))
            kind_ = 1;
        else if (cc == fourCC("DXT2") || cc == fourCC("DXT3"))
            kind_ = 3;
        else if (cc == fourCC("DXT4") || cc == fourCC("DXT5"))
            kind_ = 5;
        else {
            message(kMsgError, 3, "Unsupported compression type in DDS file");
            return false;
        }
        if (width == 0 || height == 0 || width > INT32_MAX || height > INT32_MAX) {
            message(kMsgError, 3, "Error opening texture %s (%s)", name.c_str(), "bad image size");
            return false;
        }
        info_.width = int32_t(width);
        info_.height = int32_t(height);
        info_.alpha = true;
        return true;
    }

    bool readPixels(TexelBuffer &out, const ReadLimits &limits) override {
        const uint64_t bw = (uint64_t(info_.width) + 3) / 4, bh = (uint64_t(info_.height) + 3) / 4;
        const uint64_t blockBytes = kind_ == 1 ? 8 : 16;
        if (bw * bh * blockBytes > size_ - kDataOffset) {
            message(kMsgError, 3, "getPixels() failed for image %s", name_.c_str());
            return false;
        }
        if (!out.allocate(name_, info_.width, info_.height, nativeFormat(), limits.maxImageBytes))
            return false;
        const uint8_t *block = data_ + kDataOffset;
        uint8_t texels[16][4];
        // Blocks run top-down; row 0 of the buffer is the bottom row of the picture.
        for (uint64_t by = 0; by < bh; ++by)
            for (uint64_t bx = 0; bx < bw; ++bx, block += blockBytes) {
                if (kind_ == 1) {
                    decodeColorBlock(block, texels, true);
                } else {
                    decodeColorBlock(block + 8, texels, false);
                    if (kind_ == 3)
                        decodeExplicitAlpha(block, texels);
                    else
                        decodeInterpolatedAlpha(block, texels);
                }
                for (int i = 0; i < 16; ++i) {
                    const uint64_t x = bx * 4 + (i & 3), yTop = by * 4 + (i >> 2);
                    if (x >= uint64_t(info_.width) || yTop >= uint64_t(info_.height)) continue;
                    std::memcpy(out.row(int32_t(info_.height - 1 - yTop)) + x * 4, texels[i], 4);
                }
            }
        return true;
    }

private:
    const uint8_t *data_ = nullptr;
    size_t size_ = 0;
    int kind_ = 1;
};

class DDSFactory final : public IRFactory {
public:
    std::unique_ptr<ImageReader> create() const override { return std::make_unique<DDSReader>(); }
};

}  // namespace

std::unique_ptr<IRFactory> makeDDSFactory() { return std::make_unique<DDSFactory>(); }

}  // namespace ox
