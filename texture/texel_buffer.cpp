#include "texture/texel_buffer.h"

#include <algorithm>
#include <cmath>
#include <new>

#include "core/message.h"

namespace ox {

bool TexelFormat::fromBits(int bitsPerChannel, bool isFloat, int channels, TexelFormat &out) {
    if (channels < 1 || channels > 4) return false;
    TexelType t;
    if (bitsPerChannel == 8 && !isFloat)
        t = TexelType::kU8;
    else if (bitsPerChannel == 16)
        t = isFloat ? TexelType::kF16 : TexelType::kU16;
    else if (bitsPerChannel == 32)
        t = isFloat ? TexelType::kF32 : TexelType::kU32;
    else
        return false;
    out = {t, uint8_t(channels)};
    return true;
}

bool TexelBuffer::allocate(const std::string &name, int32_t width, int32_t height,
                           TexelFormat format, uint64_t maxBytes) {
    *this = TexelBuffer();
    if (width <= 0 || height <= 0 || format.channels < 1 || format.channels > 4) {
        message(kMsgError, 3, "Invalid image size %dx%d in %s", width, height, name.c_str());
        return false;
    }
    // Both factors are below 2^31 and the texel size below 2^5, so the product fits in 64 bits.
    const uint64_t bytes = uint64_t(width) * uint64_t(height) * uint64_t(format.bytesPerTexel());
    if (bytes > maxBytes || bytes > uint64_t(SIZE_MAX)) {
        message(kMsgError, 3,
                "Image %s of %dx%d with %d channels of %d bits exceeds the limit of %llu bytes",
                name.c_str(), width, height, int(format.channels), format.bitsPerChannel(),
                static_cast<unsigned long long>(maxBytes));
        return false;
    }
    data_.reset(new (std::nothrow) uint8_t[size_t(bytes)]);
    if (!data_) {
        message(kMsgError, 3, "Could not read image %s, out of memory", name.c_str());
        return false;
    }
    width_ = width;
    height_ = height;
    format_ = format;
    texelBytes_ = uint32_t(format.bytesPerTexel());
    return true;
}

namespace {

template <typename T>
T toUnsigned(float v, double maxValue) {
    // NaN fails both comparisons and becomes 0.
    double d = double(v) * maxValue + 0.5;
    if (!(d > 0.0)) return 0;
    if (d >= maxValue) return T(maxValue);
    return T(d);
}

template <typename T>
void store(T *p, int channels, const float *v, double maxValue) {
    for (int c = 0; c < channels; ++c) p[c] = toUnsigned<T>(v[c], maxValue);
}

}  // namespace

void TexelBuffer::setTexel(int32_t x, int32_t y, const Color &c) {
    uint8_t *p = data_.get() + (size_t(y) * size_t(width_) + size_t(x)) * texelBytes_;
    float v[4];
    switch (format_.channels) {
        case 1:
            v[0] = c.luminance();
            break;
        case 2:
            v[0] = c.luminance(), v[1] = c.a;
            break;
        case 3:
            v[0] = c.r, v[1] = c.g, v[2] = c.b;
            break;
        default:
            v[0] = c.r, v[1] = c.g, v[2] = c.b, v[3] = c.a;
    }
    const int n = format_.channels;
    switch (format_.type) {
        case TexelType::kU8:
            store(p, n, v, 255.0);
            break;
        case TexelType::kU16:
            store(reinterpret_cast<uint16_t *>(p), n, v, 65535.0);
            break;
        case TexelType::kU32:
            store(reinterpret_cast<uint32_t *>(p), n, v, 4294967295.0);
            break;
        case TexelType::kF16:
            for (int i = 0; i < n; ++i) reinterpret_cast<Imath::half *>(p)[i] = Imath::half(v[i]);
            break;
        case TexelType::kF32:
            std::memcpy(p, v, sizeof(float) * n);
            break;
    }
}

void TexelBuffer::flipRows() {
    const size_t rb = rowBytes();
    std::unique_ptr<uint8_t[]> tmp(new uint8_t[rb]);
    for (int32_t y = 0, z = height_ - 1; y < z; ++y, --z) {
        std::memcpy(tmp.get(), row(y), rb);
        std::memcpy(row(y), row(z), rb);
        std::memcpy(row(z), tmp.get(), rb);
    }
}

bool TexelBuffer::convertTo(const std::string &name, TexelFormat format, TexelBuffer &out,
                            uint64_t maxBytes) const {
    if (!out.allocate(name, width_, height_, format, maxBytes)) return false;
    for (int32_t y = 0; y < height_; ++y)
        for (int32_t x = 0; x < width_; ++x) out.setTexel(x, y, texel(x, y));
    return true;
}

}  // namespace ox
