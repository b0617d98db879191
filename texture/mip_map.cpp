#include "texture/mip_map.h"

#include <algorithm>

#include "core/message.h"

namespace ox {

std::vector<Vec2i> mipLevelSizes(int32_t width, int32_t height) {
    std::vector<Vec2i> sizes;
    if (width <= 0 || height <= 0) return sizes;
    sizes.push_back({width, height});
    while (width >= 2 || height >= 2) {
        width = std::max(1, width / 2);
        height = std::max(1, height / 2);
        sizes.push_back({width, height});
    }
    return sizes;
}

uint64_t MipImage::sizeBytes() const {
    uint64_t n = 0;
    for (const TexelBuffer &b : levels_) n += b.sizeBytes();
    return n;
}

namespace {

/// The source span [begin, end) that destination index i of n covers in a source of size s:
/// pairs, with the odd last source index folded into the last destination index.
inline void span(int32_t i, int32_t n, int32_t s, int32_t &begin, int32_t &end) {
    if (n == s) {  // an axis already 1 long
        begin = i, end = i + 1;
        return;
    }
    begin = 2 * i;
    end = (i == n - 1) ? s : 2 * i + 2;
}

template <typename T, typename Store>
void downsampleTyped(const TexelBuffer &src, TexelBuffer &dst, Store store) {
    const int channels = src.format().channels;
    const int32_t sw = src.width(), sh = src.height(), dw = dst.width(), dh = dst.height();
    for (int32_t y = 0; y < dh; ++y) {
        int32_t y0, y1;
        span(y, dh, sh, y0, y1);
        T *out = reinterpret_cast<T *>(dst.row(y));
        for (int32_t x = 0; x < dw; ++x) {
            int32_t x0, x1;
            span(x, dw, sw, x0, x1);
            double sum[4] = {0, 0, 0, 0};
            for (int32_t yy = y0; yy < y1; ++yy) {
                const T *in = reinterpret_cast<const T *>(src.row(yy)) + size_t(x0) * channels;
                for (int32_t xx = x0; xx < x1; ++xx, in += channels)
                    for (int c = 0; c < channels; ++c) sum[c] += double(float(in[c]));
            }
            const double inv = 1.0 / double((x1 - x0) * (y1 - y0));
            for (int c = 0; c < channels; ++c) out[size_t(x) * channels + c] = store(sum[c] * inv);
        }
    }
}

/// Levels of even sizes: plain 2 x 2 averages, accumulated in Acc.
template <typename T, typename Acc, typename Store>
void downsampleEven(const TexelBuffer &src, TexelBuffer &dst, Store store) {
    const int channels = src.format().channels;
    for (int32_t y = 0; y < dst.height(); ++y) {
        const T *a = reinterpret_cast<const T *>(src.row(2 * y));
        const T *b = reinterpret_cast<const T *>(src.row(2 * y + 1));
        T *out = reinterpret_cast<T *>(dst.row(y));
        for (int32_t x = 0; x < dst.width(); ++x, a += 2 * channels, b += 2 * channels)
            for (int c = 0; c < channels; ++c)
                *out++ = store((Acc(float(a[c])) + Acc(float(a[c + channels])) + Acc(float(b[c])) +
                                Acc(float(b[c + channels]))) *
                               Acc(0.25));
    }
}

/// The common case of an 8-bit level with even sizes: exact integer 2 x 2 averages.
void downsampleU8Even(const TexelBuffer &src, TexelBuffer &dst) {
    const int channels = src.format().channels;
    for (int32_t y = 0; y < dst.height(); ++y) {
        const uint8_t *a = src.row(2 * y), *b = src.row(2 * y + 1);
        uint8_t *out = dst.row(y);
        for (int32_t x = 0; x < dst.width(); ++x, a += 2 * channels, b += 2 * channels)
            for (int c = 0; c < channels; ++c)
                *out++ = uint8_t((a[c] + a[c + channels] + b[c] + b[c + channels] + 2) >> 2);
    }
}

}  // namespace

void downsampleLevel(const TexelBuffer &src, TexelBuffer &dst) {
    const bool even = src.width() == 2 * dst.width() && src.height() == 2 * dst.height();
    switch (src.format().type) {
        case TexelType::kU8:
            if (even)
                downsampleU8Even(src, dst);
            else
                downsampleTyped<uint8_t>(src, dst, [](double v) { return uint8_t(v + 0.5); });
            break;
        case TexelType::kU16:
            downsampleTyped<uint16_t>(src, dst, [](double v) { return uint16_t(v + 0.5); });
            break;
        case TexelType::kU32:
            downsampleTyped<uint32_t>(src, dst, [](double v) { return uint32_t(v + 0.5); });
            break;
        case TexelType::kF16:
            if (even)
                downsampleEven<Imath::half, float>(src, dst,
                                                   [](float v) { return Imath::half(v); });
            else
                downsampleTyped<Imath::half>(src, dst,
                                             [](double v) { return Imath::half(float(v)); });
            break;
        case TexelType::kF32:
            if (even)
                downsampleEven<float, float>(src, dst, [](float v) { return v; });
            else
                downsampleTyped<float>(src, dst, [](double v) { return float(v); });
            break;
    }
}

bool MipImage::build(const std::string &name, TexelBuffer level0, bool hdr, int sourceBits,
                     uint64_t maxBytes) {
    name_ = name;
    hdr_ = hdr;
    sourceBits_ = sourceBits;
    levels_.clear();
    const std::vector<Vec2i> sizes = mipLevelSizes(level0.width(), level0.height());
    if (sizes.empty()) return false;
    levels_.reserve(sizes.size());
    levels_.push_back(std::move(level0));
    for (size_t i = 1; i < sizes.size(); ++i) {
        TexelBuffer next;
        if (!next.allocate(name, sizes[i].x, sizes[i].y, levels_[0].format(), maxBytes)) {
            message(kMsgError, 3, "Failed to allocate memory for texture %s", name.c_str());
            levels_.clear();
            return false;
        }
        downsampleLevel(levels_.back(), next);
        levels_.push_back(std::move(next));
    }
    return true;
}

bool MipImage::adopt(const std::string &name, std::vector<TexelBuffer> levels, bool hdr,
                     int sourceBits) {
    if (levels.empty()) return false;
    const std::vector<Vec2i> sizes = mipLevelSizes(levels[0].width(), levels[0].height());
    if (sizes.size() != levels.size()) return false;
    for (size_t i = 0; i < sizes.size(); ++i)
        if (levels[i].width() != sizes[i].x || levels[i].height() != sizes[i].y ||
            !(levels[i].format() == levels[0].format()))
            return false;
    name_ = name;
    levels_ = std::move(levels);
    hdr_ = hdr;
    sourceBits_ = sourceBits;
    return true;
}

}  // namespace ox
