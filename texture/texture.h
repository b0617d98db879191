#pragma once

#include <algorithm>
#include <cmath>
#include <memory>

#include "core/types.h"
#include "texture/mip_map.h"

/// Filtered texture lookups over a shared loaded image.
///
/// Coordinates: u runs left to right and v bottom to top over [0, 1]; the texture repeats
/// outside. The footprint is given by the screen-space derivatives of (u, v) from the ray
/// differentials; all derivatives 0 gives the finest level (a "unit" footprint).
namespace ox {

/// The input of one lookup: the texture coordinate and its derivatives along the two
/// screen-space axes.
struct TextureLookup {
    float u = 0.0f, v = 0.0f;
    float dudx = 0.0f, dvdx = 0.0f;
    float dudy = 0.0f, dvdy = 0.0f;
};

/// Filter modes of TextureFactory::getTexture; any other value gives kMipMap.
enum TextureFilterMode : int {
    kFilterSimple = 0,   ///< SimpleTexture: bilinear on the finest level
    kFilterEWA = 1,      ///< EWATexture: elliptical weighted average over the footprint
    kFilterMipMap = 2,   ///< MipMapTexture: trilinear
    kFilterAniso = 3,    ///< AnisoTexture: several trilinear taps along the footprint
    kFilterPrepass = 4,  ///< PrepassMipMapTexture: trilinear, one level blurrier
};

/// A texture as shading sees it.
class OXTexture {
public:
    /// The filtered colour at a lookup.
    virtual Color lookup(const TextureLookup &at) const = 0;
    /// Copies the finest level's texels of a region (rows from the bottom) into out, row by
    /// row; false when the region is not inside the image.
    virtual bool readPixels(const Region &region, Color *out) const = 0;
    /// Width and height of the finest level.
    virtual Vec2i resolution() const = 0;
    /// True when the image has more than 8 bits per channel.
    virtual bool isHDR() const = 0;
    virtual ~OXTexture() = default;
};

/// The texture of a file that could not be made: resolution 0 x 0, every lookup black.
class BlackTexture final : public OXTexture {
public:
    Color lookup(const TextureLookup &) const override { return Color::black(); }
    bool readPixels(const Region &, Color *) const override { return false; }
    Vec2i resolution() const override { return {0, 0}; }
    bool isHDR() const override { return false; }
};

/// The filter kernels, usable directly on a MipImage without a virtual call.
namespace texfilter {

/// Largest ratio of the footprint's long to short axis before the short one is widened.
constexpr float kMaxAnisotropy = 16.0f;
/// Most taps of the anisotropic filter.
constexpr int kMaxAnisoTaps = 16;

/// Wraps a coordinate into [0, 1); NaN and infinities give 0.
inline float wrap(float u) {
    float f = u - std::floor(u);
    return (f >= 0.0f && f < 1.0f) ? f : 0.0f;
}

/// Repeats an integer texel index into [0, n).
inline int32_t wrapIndex(int32_t i, int32_t n) {
    i %= n;
    return i < 0 ? i + n : i;
}

/// The texel nearest to (u, v) of one level.
inline Color nearest(const TexelBuffer &b, float u, float v) {
    const int32_t x = std::min(int32_t(wrap(u) * float(b.width())), b.width() - 1);
    const int32_t y = std::min(int32_t(wrap(v) * float(b.height())), b.height() - 1);
    return b.texel(x, y);
}

/// Bilinear interpolation of one level; texel centres sit at (i + 0.5) / size.
inline Color bilinear(const TexelBuffer &b, float u, float v) {
    const int32_t w = b.width(), h = b.height();
    const float x = wrap(u) * float(w) - 0.5f, y = wrap(v) * float(h) - 0.5f;
    const float fx0 = std::floor(x), fy0 = std::floor(y);
    const float fx = x - fx0, fy = y - fy0;
    int32_t x0 = int32_t(fx0), y0 = int32_t(fy0);
    if (x0 < 0) x0 += w;
    if (y0 < 0) y0 += h;
    x0 = std::min(x0, w - 1), y0 = std::min(y0, h - 1);
    const int32_t x1 = x0 + 1 < w ? x0 + 1 : 0, y1 = y0 + 1 < h ? y0 + 1 : 0;
    return (b.texel(x0, y0) * (1.0f - fx) + b.texel(x1, y0) * fx) * (1.0f - fy) +
           (b.texel(x0, y1) * (1.0f - fx) + b.texel(x1, y1) * fx) * fy;
}

/// Trilinear lookup at a level of detail (0 = finest, fractional values blend two levels).
inline Color trilinear(const MipImage &img, float u, float v, float lod) {
    const int last = img.levelCount() - 1;
    if (!(lod > 0.0f)) return bilinear(img.level(0), u, v);
    if (lod >= float(last)) return bilinear(img.level(last), u, v);
    const int l0 = int(lod);
    const float t = lod - float(l0);
    return bilinear(img.level(l0), u, v) * (1.0f - t) + bilinear(img.level(l0 + 1), u, v) * t;
}

/// log2 of a footprint width in texels of level 0; -inf for 0, and 0 for non-finite input.
inline float lodOf(float widthTexels) {
    if (!(widthTexels > 0.0f)) return -1.0f;
    const float l = std::log2(widthTexels);
    return std::isfinite(l) ? l : 0.0f;
}

/// The footprint axes in texels of level 0.
struct Footprint {
    float ax, ay, bx, by;
};
inline Footprint footprint(const MipImage &img, const TextureLookup &at) {
    const float w = float(img.width()), h = float(img.height());
    Footprint f{at.dudx * w, at.dvdx * h, at.dudy * w, at.dvdy * h};
    if (!std::isfinite(f.ax) || !std::isfinite(f.ay) || !std::isfinite(f.bx) ||
        !std::isfinite(f.by))
        f = {0, 0, 0, 0};
    return f;
}

/// Trilinear with the level chosen by the longer footprint axis, plus a level bias.
inline Color mipMap(const MipImage &img, const TextureLookup &at, float bias = 0.0f) {
    const Footprint f = footprint(img, at);
    const float width = std::sqrt(std::max(f.ax * f.ax + f.ay * f.ay, f.bx * f.bx + f.by * f.by));
    return trilinear(img, at.u, at.v, lodOf(width) + bias);
}

/// Several trilinear taps along the longer axis, at the level of the shorter one.
inline Color aniso(const MipImage &img, const TextureLookup &at) {
    Footprint f = footprint(img, at);
    float la = f.ax * f.ax + f.ay * f.ay, lb = f.bx * f.bx + f.by * f.by;
    if (la < lb) {
        std::swap(f.ax, f.bx), std::swap(f.ay, f.by);
        std::swap(la, lb);
    }
    const float major = std::sqrt(la), minor = std::sqrt(lb);
    if (!(major > 1.0f)) return bilinear(img.level(0), at.u, at.v);
    const int taps =
        int(std::clamp(std::ceil(major / std::max(minor, 1e-6f)), 1.0f, float(kMaxAnisoTaps)));
    const float lod = lodOf(major / float(taps));
    // Taps spread evenly over the major axis, centred on the lookup point.
    const float du = (f.ax / float(img.width())), dv = (f.ay / float(img.height()));
    Color sum;
    for (int i = 0; i < taps; ++i) {
        const float t = (float(i) + 0.5f) / float(taps) - 0.5f;
        sum += trilinear(img, at.u + du * t, at.v + dv * t, lod);
    }
    return sum * (1.0f / float(taps));
}

/// Weights of the Gaussian of the elliptical filter, indexed by squared radius in [0, 1).
struct EWAWeights {
    static constexpr int kSize = 128;
    float w[kSize];
    EWAWeights() {
        const float alpha = 2.0f;
        for (int i = 0; i < kSize; ++i) {
            const float r2 = float(i) / float(kSize - 1);
            w[i] = std::exp(-alpha * r2) - std::exp(-alpha);
        }
    }
};
inline const EWAWeights &ewaWeights() {
    static const EWAWeights weights;
    return weights;
}

/// The elliptical weighted average of one level over an ellipse given by two axes in texels of
/// that level, centred at (s, t) in texel coordinates.
inline Color ewaLevel(const TexelBuffer &b, float u, float v, float ax, float ay, float bx,
                      float by) {
    const int32_t w = b.width(), h = b.height();
    const float s = wrap(u) * float(w) - 0.5f, t = wrap(v) * float(h) - 0.5f;
    // Implicit ellipse A x^2 + B x y + C y^2 = F; the +1 keeps at least one texel inside.
    float A = ay * ay + by * by + 1.0f;
    float B = -2.0f * (ax * ay + bx * by);
    float C = ax * ax + bx * bx + 1.0f;
    const float F = A * C - B * B * 0.25f;
    A /= F, B /= F, C /= F;
    const float det = -B * B + 4.0f * A * C;
    const float invDet = 1.0f / det;
    const float uR = std::sqrt(det * C) * invDet * 2.0f, vR = std::sqrt(A * det) * invDet * 2.0f;
    const int32_t s0 = int32_t(std::ceil(s - uR)), s1 = int32_t(std::floor(s + uR));
    const int32_t t0 = int32_t(std::ceil(t - vR)), t1 = int32_t(std::floor(t + vR));
    const EWAWeights &table = ewaWeights();
    Color sum;
    float wsum = 0.0f;
    for (int32_t y = t0; y <= t1; ++y) {
        const float tt = float(y) - t;
        const int32_t wy = wrapIndex(y, h);
        for (int32_t x = s0; x <= s1; ++x) {
            const float ss = float(x) - s;
            const float r2 = A * ss * ss + B * ss * tt + C * tt * tt;
            if (r2 < 1.0f) {
                const float weight =
                    table.w[std::min(int(r2 * EWAWeights::kSize), EWAWeights::kSize - 1)];
                sum += b.texel(wrapIndex(x, w), wy) * weight;
                wsum += weight;
            }
        }
    }
    return wsum > 0.0f ? sum * (1.0f / wsum) : bilinear(b, u, v);
}

/// The elliptical weighted average over the footprint: the level is chosen by the shorter axis
/// (widened so that the ellipse is at most kMaxAnisotropy times longer than wide), and the
/// results of the two nearest levels are blended.
inline Color ewa(const MipImage &img, const TextureLookup &at) {
    Footprint f = footprint(img, at);
    float la = f.ax * f.ax + f.ay * f.ay, lb = f.bx * f.bx + f.by * f.by;
    if (la < lb) {
        std::swap(f.ax, f.bx), std::swap(f.ay, f.by);
        std::swap(la, lb);
    }
    const float major = std::sqrt(la);
    float minor = std::sqrt(lb);
    if (!(major > 0.0f)) return bilinear(img.level(0), at.u, at.v);
    if (minor * kMaxAnisotropy < major) {
        // Widen the short axis: perpendicular to the long one, major / kMaxAnisotropy long.
        const float scale = major / kMaxAnisotropy / major;
        f.bx = -f.ay * scale, f.by = f.ax * scale;
        minor = major / kMaxAnisotropy;
    }
    const int last = img.levelCount() - 1;
    const float lod = std::max(0.0f, lodOf(minor));
    if (lod >= float(last)) return bilinear(img.level(last), at.u, at.v);
    const int l0 = int(lod);
    const float t = lod - float(l0);
    auto at_level = [&](int l) {
        const TexelBuffer &b = img.level(l);
        const float sx = float(b.width()) / float(img.width());
        const float sy = float(b.height()) / float(img.height());
        return ewaLevel(b, at.u, at.v, f.ax * sx, f.ay * sy, f.bx * sx, f.by * sy);
    };
    const Color c0 = at_level(l0);
    return t > 0.0f ? c0 * (1.0f - t) + at_level(l0 + 1) * t : c0;
}

}  // namespace texfilter

/// Shared parts of the lookup objects over one loaded image.
class ImageTexture : public OXTexture {
public:
    explicit ImageTexture(std::shared_ptr<const MipImage> image) : image_(std::move(image)) {}
    bool readPixels(const Region &region, Color *out) const override;
    Vec2i resolution() const override { return {image_->width(), image_->height()}; }
    bool isHDR() const override { return image_->isHDR(); }
    /// The loaded image (shared by every lookup object of the file).
    const std::shared_ptr<const MipImage> &image() const { return image_; }

protected:
    std::shared_ptr<const MipImage> image_;
};

/// Bilinear (or nearest) on the finest level; the footprint is ignored.
class SimpleTexture final : public ImageTexture {
public:
    explicit SimpleTexture(std::shared_ptr<const MipImage> image, bool nearest = false)
        : ImageTexture(std::move(image)), nearest_(nearest) {}
    Color filter(const TextureLookup &at) const {
        return nearest_ ? texfilter::nearest(image_->level(0), at.u, at.v)
                        : texfilter::bilinear(image_->level(0), at.u, at.v);
    }
    Color lookup(const TextureLookup &at) const override { return filter(at); }

private:
    bool nearest_;
};

/// Trilinear mip-mapped lookup; the level follows the longer footprint axis.
class MipMapTexture final : public ImageTexture {
public:
    using ImageTexture::ImageTexture;
    Color filter(const TextureLookup &at) const { return texfilter::mipMap(*image_, at); }
    Color lookup(const TextureLookup &at) const override { return filter(at); }
};

/// Elliptical weighted average (Gaussian) over the footprint ellipse.
class EWATexture final : public ImageTexture {
public:
    using ImageTexture::ImageTexture;
    Color filter(const TextureLookup &at) const { return texfilter::ewa(*image_, at); }
    Color lookup(const TextureLookup &at) const override { return filter(at); }
};

/// Anisotropic lookup: up to 16 trilinear taps along the longer footprint axis.
class AnisoTexture final : public ImageTexture {
public:
    using ImageTexture::ImageTexture;
    Color filter(const TextureLookup &at) const { return texfilter::aniso(*image_, at); }
    Color lookup(const TextureLookup &at) const override { return filter(at); }
};

/// The lookup of GI prepasses and probe blurs: trilinear one level coarser than MipMapTexture,
/// which hides the noise of the sparse prepass samples.
class PrepassMipMapTexture final : public ImageTexture {
public:
    using ImageTexture::ImageTexture;
    Color filter(const TextureLookup &at) const { return texfilter::mipMap(*image_, at, 1.0f); }
    Color lookup(const TextureLookup &at) const override { return filter(at); }
};

/// A lookup object of a filter mode over a loaded image (unknown modes give MipMapTexture).
std::unique_ptr<OXTexture> makeTexture(std::shared_ptr<const MipImage> image, int filterMode);

}  // namespace ox
