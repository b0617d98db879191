#pragma once

#include <Imath/half.h>

#include <cstdint>
#include <cstring>
#include <memory>
#include <string>

#include "core/types.h"

/// Texel buffers: the pixels of one image level in one of the system's layouts.
namespace ox {

/// How one channel is stored.
enum class TexelType : uint8_t {
    kU8,   ///< 8-bit unsigned, 0..255 maps to 0..1
    kU16,  ///< 16-bit unsigned, 0..65535 maps to 0..1
    kF16,  ///< 16-bit half float
    kU32,  ///< 32-bit unsigned, 0..2^32-1 maps to 0..1
    kF32,  ///< 32-bit float
};

/// A texel layout: channel type and channel count (1 grey, 2 grey + alpha, 3 colour, 4 colour +
/// alpha).
struct TexelFormat {
    TexelType type = TexelType::kU8;
    uint8_t channels = 4;

    /// The layout for bits per channel, float flag and channel count; nullopt-like false when the
    /// combination has no buffer type.
    static bool fromBits(int bitsPerChannel, bool isFloat, int channels, TexelFormat &out);
    int bitsPerChannel() const { return bytesPerChannel() * 8; }
    int bytesPerChannel() const {
        return type == TexelType::kU8                                 ? 1
               : (type == TexelType::kU16 || type == TexelType::kF16) ? 2
                                                                      : 4;
    }
    int bytesPerTexel() const { return bytesPerChannel() * channels; }
    bool isFloat() const { return type == TexelType::kF16 || type == TexelType::kF32; }
    bool hasAlpha() const { return channels == 2 || channels == 4; }
    bool isGrey() const { return channels <= 2; }
    /// True for layouts of more than 8 bits per channel.
    bool isHDR() const { return type != TexelType::kU8; }
    bool operator==(const TexelFormat &o) const = default;
};

/// Default limit on the bytes of one image level (1 GiB).
constexpr uint64_t kDefaultMaxImageBytes = uint64_t(1) << 30;

/// The pixels of one image level: rows from the bottom of the picture (row 0) upwards, texels
/// packed, channels interleaved.
class TexelBuffer {
public:
    TexelBuffer() = default;
    TexelBuffer(TexelBuffer &&) = default;
    TexelBuffer &operator=(TexelBuffer &&) = default;

    /// Allocates width x height texels of a layout (contents undefined). The size is computed in
    /// 64 bits and refused above maxBytes or when memory runs out; then one error naming `name`
    /// is reported and false returned.
    bool allocate(const std::string &name, int32_t width, int32_t height, TexelFormat format,
                  uint64_t maxBytes = kDefaultMaxImageBytes);
    /// Releases the texels.
    void clear() { *this = TexelBuffer(); }

    int32_t width() const { return width_; }
    int32_t height() const { return height_; }
    TexelFormat format() const { return format_; }
    bool empty() const { return !data_; }
    uint64_t sizeBytes() const {
        return uint64_t(width_) * uint64_t(height_) * format_.bytesPerTexel();
    }
    size_t rowBytes() const { return size_t(width_) * format_.bytesPerTexel(); }
    uint8_t *data() { return data_.get(); }
    const uint8_t *data() const { return data_.get(); }
    uint8_t *row(int32_t y) { return data_.get() + size_t(y) * rowBytes(); }
    const uint8_t *row(int32_t y) const { return data_.get() + size_t(y) * rowBytes(); }

    /// The texel at (x, y) (inside the buffer) as a colour: grey fills R, G and B; a missing
    /// alpha is 1.
    Color texel(int32_t x, int32_t y) const {
        const uint8_t *p = data_.get() + (size_t(y) * size_t(width_) + size_t(x)) * texelBytes_;
        switch (format_.type) {
            case TexelType::kU8:
                return expand(reinterpret_cast<const uint8_t *>(p), 1.0f / 255.0f);
            case TexelType::kU16:
                return expand(reinterpret_cast<const uint16_t *>(p), 1.0f / 65535.0f);
            case TexelType::kF16:
                return expand(reinterpret_cast<const Imath::half *>(p), 1.0f);
            case TexelType::kU32:
                return expand(reinterpret_cast<const uint32_t *>(p), float(1.0 / 4294967295.0));
            case TexelType::kF32:
                return expand(reinterpret_cast<const float *>(p), 1.0f);
        }
        return {};
    }
    /// Stores a colour at (x, y) in the buffer's layout: integers are clamped to their range and
    /// rounded; grey layouts keep the luminance.
    void setTexel(int32_t x, int32_t y, const Color &c);
    /// Mirrors the rows (top-down to bottom-up).
    void flipRows();
    /// A copy of this buffer in another layout (false and one error when it cannot be made).
    bool convertTo(const std::string &name, TexelFormat format, TexelBuffer &out,
                   uint64_t maxBytes = kDefaultMaxImageBytes) const;

private:
    template <typename T>
    Color expand(const T *p, float scale) const {
        switch (format_.channels) {
            case 1: {
                float g = float(p[0]) * scale;
                return {g, g, g, 1.0f};
            }
            case 2: {
                float g = float(p[0]) * scale;
                return {g, g, g, float(p[1]) * scale};
            }
            case 3:
                return {float(p[0]) * scale, float(p[1]) * scale, float(p[2]) * scale, 1.0f};
            default:
                return {float(p[0]) * scale, float(p[1]) * scale, float(p[2]) * scale,
                        float(p[3]) * scale};
        }
    }

    std::unique_ptr<uint8_t[]> data_;
    int32_t width_ = 0, height_ = 0;
    TexelFormat format_;
    uint32_t texelBytes_ = 4;
};

/// Reads a little-endian value from bytes.
inline uint16_t readLE16(const uint8_t *p) { return uint16_t(p[0] | (p[1] << 8)); }
inline uint32_t readLE32(const uint8_t *p) {
    return uint32_t(p[0]) | (uint32_t(p[1]) << 8) | (uint32_t(p[2]) << 16) | (uint32_t(p[3]) << 24);
}

}  // namespace ox
