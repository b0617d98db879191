// The image-based light: a light probe split into directional sub-lights of about equal energy.
#include <algorithm>
#include <cmath>

#include "core/message.h"
#include "core/random.h"
#include "shading/light.h"
#include "texture/texture_factory.h"

namespace ox {
namespace {

constexpr double kPiD = 3.14159265358979323846;
constexpr float kReach = 1e16f;

// A rectangle of probe texels [x0, x1) x [y0, y1).
struct ProbeRegion {
    int32_t x0, y0, x1, y1;
};

// Summed-area table of the split weights, in double.
class EnergyTable {
public:
    EnergyTable(const LightProbeImage &probe, const std::vector<double> &rowWeight)
        : w_(size_t(probe.width) + 1), sums_(w_ * (size_t(probe.height) + 1), 0.0) {
        for (int32_t y = 0; y < probe.height; ++y)
            for (int32_t x = 0; x < probe.width; ++x) {
                const double e = texelEnergy(probe.at(x, y)) * rowWeight[size_t(y)];
                at(x + 1, y + 1) = e + at(x, y + 1) + at(x + 1, y) - at(x, y);
            }
    }
    double sum(int32_t x0, int32_t y0, int32_t x1, int32_t y1) const {
        return at(x1, y1) - at(x0, y1) - at(x1, y0) + at(x0, y0);
    }
    // Luminance of a texel for splitting: negative and non-finite values count as 0.
    static double texelEnergy(const Color &c) {
        const double l = c.luminance();
        return std::isfinite(l) && l > 0.0 ? l : 0.0;
    }

private:
    double &at(int32_t x, int32_t y) { return sums_[size_t(y) * w_ + size_t(x)]; }
    double at(int32_t x, int32_t y) const { return sums_[size_t(y) * w_ + size_t(x)]; }
    size_t w_;
    std::vector<double> sums_;
};

// The cut of [lo, hi) that halves energy(lo, k) against the whole: the first k in (lo, hi)
// whose lower part holds at least half; the middle when there is no energy.
template <typename Energy>
int32_t halvingCut(int32_t lo, int32_t hi, Energy &&energy) {
    const double total = energy(lo, hi);
    if (!(total > 0.0)) return lo + (hi - lo) / 2;
    int32_t a = lo + 1, b = hi - 1;
    while (a < b) {
        const int32_t m = a + (b - a) / 2;
        if (energy(lo, m) >= 0.5 * total)
            b = m;
        else
            a = m + 1;
    }
    return a;
}

inline bool finiteColor(const Color &c) {
    return std::isfinite(c.r) && std::isfinite(c.g) && std::isfinite(c.b) && std::isfinite(c.a);
}

}  // namespace

Vec3 probeDirection(float u, float v) {
    const double theta = kPiD * (1.0 - double(v));  // from +y
    const double phi = 2.0 * kPiD * double(u);
    const double s = std::sin(theta);
    return Vec3(float(s * std::cos(phi)), float(std::cos(theta)), float(s * std::sin(phi)));
}

bool KDHDRLight::buildSubLights(const LightProbeImage &probe) {
    if (!probe.valid()) return false;
    const int32_t w = probe.width, h = probe.height;
    // Rows weighted by their solid angle, sampled at the row centre so that no row weighs 0.
    std::vector<double> rowWeight(static_cast<size_t>(h));
    for (int32_t y = 0; y < h; ++y) rowWeight[size_t(y)] = std::sin(kPiD * (y + 0.5) / h);
    const EnergyTable table(probe, rowWeight);

    // Recursive halving: every level splits each region across its longer angular side.
    std::vector<ProbeRegion> regions{{0, 0, w, h}}, next;
    while (regions.size() < subLights_) {
        next.clear();
        bool split = false;
        // Regions of a single texel stay whole, so a level may split fewer than all regions; the
        // count never exceeds the number of sub-lights.
        size_t splits = subLights_ - regions.size();
        for (const ProbeRegion &r : regions) {
            const int32_t rw = r.x1 - r.x0, rh = r.y1 - r.y0;
            if ((rw < 2 && rh < 2) || splits == 0) {
                next.push_back(r);
                continue;
            }
            const double midRow = 0.5 * (r.y0 + r.y1);
            const double across = rw * (2.0 * kPiD / w) * std::sin(kPiD * midRow / h);
            const double along = rh * (kPiD / h);
            split = true;
            --splits;
            if (rh < 2 || (rw >= 2 && across >= along)) {
                const int32_t k = halvingCut(
                    r.x0, r.x1, [&](int32_t a, int32_t b) { return table.sum(a, r.y0, b, r.y1); });
                next.push_back({r.x0, r.y0, k, r.y1});
                next.push_back({k, r.y0, r.x1, r.y1});
            } else {
                const int32_t k = halvingCut(
                    r.y0, r.y1, [&](int32_t a, int32_t b) { return table.sum(r.x0, a, r.x1, b); });
                next.push_back({r.x0, r.y0, r.x1, k});
                next.push_back({r.x0, k, r.x1, r.y1});
            }
        }
        regions.swap(next);
        if (!split) break;
    }

    // One sub-light per region: its radiance times solid angle, at its energy centre.
    const double texelOmega = (2.0 * kPiD / w) * (kPiD / h);
    const double norm = 1.0 / (2.0 * kPiD * kPiD);
    const float turnC = std::cos(turnDome_), turnS = std::sin(turnDome_);
    auto place = [&](Vec3 d) {
        d = Vec3(d.x * turnC - d.z * turnS, d.y, d.x * turnS + d.z * turnC);
        return swapYZ_ ? Vec3(d.x, d.z, d.y) : d;
    };
    std::vector<IBLSubLight> lights;
    lights.reserve(regions.size());
    float brightest = -1.0f;
    for (const ProbeRegion &r : regions) {
        double cr = 0, cg = 0, cb = 0, ca = 0, energy = 0, omega = 0;
        double dx = 0, dy = 0, dz = 0;
        for (int32_t y = r.y0; y < r.y1; ++y) {
            const double dw = texelOmega * rowWeight[size_t(y)];
            for (int32_t x = r.x0; x < r.x1; ++x) {
                const Color &c = probe.at(x, y);
                omega += dw;
                if (!finiteColor(c)) continue;
                cr += std::max(0.0f, c.r) * dw, cg += std::max(0.0f, c.g) * dw;
                cb += std::max(0.0f, c.b) * dw, ca += std::max(0.0f, c.a) * dw;
                const double e = EnergyTable::texelEnergy(c) * dw;
                const Vec3 d = probeDirection((x + 0.5f) / w, (y + 0.5f) / h);
                energy += e;
                dx += e * d.x, dy += e * d.y, dz += e * d.z;
            }
        }
        if (!(energy > 0.0)) continue;
        IBLSubLight l;
        l.direction = place(Vec3(float(dx), float(dy), float(dz)).normalized());
        l.color = Color(float(cr * norm), float(cg * norm), float(cb * norm), float(ca * norm));
        Vec3 u, v;
        perpendicularBasis(l.direction, u, v);
        const float spread = 0.5f * float(std::sqrt(omega));
        l.spreadU = u * spread;
        l.spreadV = v * spread;
        if (l.color.luminance() > brightest) {
            brightest = l.color.luminance();
            mainDirection_ = l.direction;
        }
        lights.push_back(l);
    }
    lights_.swap(lights);
    return true;
}

Color KDHDRLight::sum(const Vec3 &p, const Vec3 &n, LightContext &ctx, bool withShadow) const {
    const float scale = intensity_ * intensityScale(ctx.rayType);
    const bool traced = withShadow && castsShadowsFor(ctx) && ctx.tracer && ctx.tracer->ads &&
                        ctx.rayDepth < kShadowDepthLimit;
    // Noise instead of banding: shadow rays jitter over their region by this fraction.
    const float jitter = 1.0f - std::clamp(bandingVsNoise_, 0.0f, 1.0f);
    auto transmitted = [&](const IBLSubLight &l) {
        Vec3 d = l.direction;
        if (jitter > 0.0f && ctx.random) {
            const float a = 2.0f * ctx.random->next() - 1.0f, b = 2.0f * ctx.random->next() - 1.0f;
            d = (d + (l.spreadU * a + l.spreadV * b) * jitter).normalized();
        }
        return shadowSegmentTransmission(p, p + d * kReach, ctx);
    };
    Color total;
    if (!traced || !ctx.singleShadowRay) {
        for (const IBLSubLight &l : lights_) {
            const float c = dot(l.direction, n);
            if (c > 0.0f) total += traced ? l.color * transmitted(l) * c : l.color * c;
        }
        return total * scale;
    }
    // One shadow ray: a sub-light chosen by its contribution stands for all of them.
    float weight = 0.0f;
    for (const IBLSubLight &l : lights_) {
        const float c = dot(l.direction, n);
        if (c > 0.0f) {
            total += l.color * c;
            weight += l.color.luminance() * c;
        }
    }
    if (!(weight > 0.0f)) return total * scale;
    float pick = (ctx.random ? ctx.random->next() : 0.5f) * weight;
    const IBLSubLight *chosen = nullptr;
    for (const IBLSubLight &l : lights_) {
        const float c = dot(l.direction, n);
        if (!(c > 0.0f) || !(l.color.luminance() * c > 0.0f)) continue;
        chosen = &l;  // the last candidate catches a draw of exactly 1
        pick -= l.color.luminance() * c;
        if (pick < 0.0f) break;
    }
    return chosen ? total * transmitted(*chosen) * scale : total * scale;
}

Color KDHDRLight::illuminate(const Vec3 &p, const Vec3 &n, LightContext &ctx,
                             bool withShadow) const {
    return sum(p, n, ctx, withShadow);
}

void KDHDRLight::illuminateBoth(Color &shadowed, Color &unshadowed, const Vec3 &p, const Vec3 &n,
                                LightContext &ctx) const {
    // Each sub-light has its own shadow, so the shadowed sum is traced as a whole.
    unshadowed = sum(p, n, ctx, false);
    shadowed = sum(p, n, ctx, true);
}

std::vector<std::unique_ptr<KDSpecularSubLight>> KDHDRLight::makeSpecularSubLights() const {
    std::vector<std::unique_ptr<KDSpecularSubLight>> out;
    out.reserve(lights_.size());
    // When the image light itself emits diffuse light, the sub-lights feed specular shading
    // only: otherwise every diffuse surface would receive the probe twice.
    const bool specularOnly = hasFlag(kLightDiffuse);
    for (const IBLSubLight &l : lights_)
        out.push_back(std::make_unique<KDSpecularSubLight>(
            l.direction, l.color * (intensity_ * specularBoost_), hasFlag(kLightShadows),
            specularOnly));
    return out;
}

KDSpecularSubLight::KDSpecularSubLight(const Vec3 &direction, const Color &color, bool shadows,
                                       bool specularOnly)
    : LightSource("SpecularSublight"), direction_(direction), color_(color) {
    flags_ = (specularOnly ? kLightSpecular : kLightDiffuse | kLightSpecular | kLightAmbient) |
             (shadows ? kLightShadows : 0u);
    bounds_ = BBox(Vec3(-3.4028235e38f, -3.4028235e38f, -3.4028235e38f),
                   Vec3(3.4028235e38f, 3.4028235e38f, 3.4028235e38f));
    shadow_.kind = ShadowSamplerSettings::kDirectional;
}

Color KDSpecularSubLight::illuminate(const Vec3 &p, const Vec3 &, LightContext &ctx,
                                     bool withShadow) const {
    Color c = color_ * intensityScale(ctx.rayType);
    if (withShadow && c.luminance() > 0.0f) c = c * shadowTransmission(p, ctx, 1.0f);
    return c;
}

Color KDSpecularSubLight::shadowTransmission(const Vec3 &p, LightContext &ctx,
                                             float importance) const {
    if (!castsShadowsFor(ctx)) return Color::white();
    return traceDirectionalShadow(shadow_, direction_, nullptr, p, ctx, importance);
}

bool readLightProbe(TextureFactory &textures, const std::string &file, LightProbeImage &out,
                    int32_t maxSide) {
    const std::shared_ptr<const MipImage> image = textures.getImage(file);
    if (!image || image->levelCount() == 0) return false;
    int level = 0;
    while (level + 1 < image->levelCount() &&
           (image->level(level).width() > maxSide || image->level(level).height() > maxSide))
        ++level;
    const TexelBuffer &b = image->level(level);
    if (b.width() <= 0 || b.height() <= 0) return false;
    LightProbeImage probe;
    probe.width = b.width();
    probe.height = b.height();
    probe.texels.resize(size_t(b.width()) * size_t(b.height()));
    for (int32_t y = 0; y < b.height(); ++y)
        for (int32_t x = 0; x < b.width(); ++x)
            probe.texels[size_t(y) * size_t(b.width()) + size_t(x)] = b.texel(x, y);
    out = std::move(probe);
    return true;
}

std::unique_ptr<KDHDRLight> createImageBasedLight(const EnvironmentValues &values,
                                                  TextureFactory &textures) {
    LightProbeImage probe;
    auto light = std::make_unique<KDHDRLight>(values);
    if (!readLightProbe(textures, values.iblImageFile, probe) || !light->buildSubLights(probe)) {
        message(kMsgError, 6, "Error reading IBL lightprobe");
        return nullptr;
    }
    return light;
}

}  // namespace ox
