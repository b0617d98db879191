#include "render/image_sampler.h"

#include <algorithm>
#include <cmath>

#include "core/message.h"

namespace ox {
namespace {

/// A well-mixed 32-bit hash of a lattice cell, for jitter that does not depend on tile order.
uint32_t cellHash(int64_t x, int64_t y, int32_t size) {
    uint64_t h = uint64_t(x) * 0x9E3779B97F4A7C15ull ^ uint64_t(y) * 0xC2B2AE3D27D4EB4Full ^
                 uint64_t(uint32_t(size)) * 0x165667B19E3779F9ull;
    h ^= h >> 33;
    h *= 0xFF51AFD7ED558CCDull;
    h ^= h >> 33;
    h *= 0xC4CEB9FE1A85EC53ull;
    h ^= h >> 33;
    return uint32_t(h);
}

float clampChannel(float v, float lo, float hi) { return v < lo ? lo : (v > hi ? hi : v); }

}  // namespace

const char *filterName(FilterKind kind) {
    static const char *const kNames[] = {"Box",        "Triangle", "Cubic",    "Gauss",
                                         "CatmullRom", "Lanczos",  "Mitchell", "Tavik"};
    const int32_t i = int32_t(kind);
    return i >= 0 && i < 8 ? kNames[i] : "Box";
}

ImageSampler::ImageSampler(const ImageSamplerSettings &settings, Pattern pattern, FilterKind filter)
    : settings_(settings), pattern_(pattern), filter_(filter) {
    ImageSamplerSettings &s = settings_;
    auto clampRate = [](int32_t &rate, const char *key) {
        const int32_t c = std::clamp(rate, kMinSampleRate, kMaxSampleRate);
        if (c != rate)
            message(kMsgWarning, 6, "%s %d is outside %d to %d, using %d", key, rate,
                    kMinSampleRate, kMaxSampleRate, c);
        rate = c;
    };
    clampRate(s.minSampleRate, "minSampleRate");
    clampRate(s.maxSampleRate, "maxSampleRate");
    if (s.maxSampleRate < s.minSampleRate) {
        message(kMsgWarning, 6, "maxSampleRate %d is below minSampleRate %d, using %d",
                s.maxSampleRate, s.minSampleRate, s.minSampleRate);
        s.maxSampleRate = s.minSampleRate;
    }
    for (float *size : {&s.filterSize.x, &s.filterSize.y})
        if (!(*size > 0.0f && *size <= 64.0f)) {
            message(kMsgWarning, 6, "filterSize %f is outside (0, 64], using 1", double(*size));
            *size = 1.0f;
        }
    if (!(s.contrast >= 0.0f)) s.contrast = 0.0f;
    traceEdges_ = pattern == Pattern::kRegular && s.edgeTracing;
    lensSide_ = std::max(1, int32_t(std::sqrt(double(s.lensSamples))));
    timeCount_ = s.motionSamples > 0 ? int32_t(std::min<uint32_t>(s.motionSamples, 1024)) : 1;
    levels_ = s.maxSampleRate - s.minSampleRate;
    coarse_ = std::ldexp(1.0f, -s.minSampleRate);
    fine_ = std::ldexp(1.0f, -s.maxSampleRate);
}

AdaptiveLDAA::AdaptiveLDAA(const ImageSamplerSettings &settings)
    : ImageSampler(settings, Pattern::kJittered,
                   settings.filter == int32_t(FilterKind::kBox)        ? FilterKind::kBox
                   : settings.filter == int32_t(FilterKind::kTriangle) ? FilterKind::kTriangle
                                                                       : FilterKind::kGauss) {}

AdaptiveEdgeSuperSampling::AdaptiveEdgeSuperSampling(const ImageSamplerSettings &settings)
    : ImageSampler(settings, Pattern::kRegular,
                   settings.filter >= 0 && settings.filter <= 7 ? FilterKind(settings.filter)
                                                                : FilterKind::kBox) {}

std::unique_ptr<ImageSampler> createImageSampler(const ImageSamplerSettings &settings) {
    if (settings.samplingMode == 2) return std::make_unique<AdaptiveEdgeSuperSampling>(settings);
    return std::make_unique<AdaptiveLDAA>(settings);
}

void ImageSampler::reportSetup() const {
    const ImageSamplerSettings &s = settings_;
    auto samples = [](int32_t rate) { return rate >= 0 ? 1 << (2 * rate) : 1; };
    message(kMsgVerbose, 6, "Adaptive Image Sampler initialize");
    message(kMsgVerbose, 6, "Min Step      : %d", s.minSampleRate);
    message(kMsgVerbose, 6, "Max Step      : %d", s.maxSampleRate);
    message(kMsgVerbose, 6, "Min Samples   : %d", samples(s.minSampleRate));
    message(kMsgVerbose, 6, "Max Samples   : %d", samples(s.maxSampleRate));
    message(kMsgVerbose, 6, "Lens Samples  : %d", lensSide_ * lensSide_);
    message(kMsgVerbose, 6, "Time Samples  : %d", timeCount_);
    message(kMsgVerbose, 6, "Contrast      : %f", double(s.contrast));
    message(kMsgVerbose, 6, "Filter Type   : %s", filterName(filter_));
    message(kMsgVerbose, 6, "Filter Width  : %f", double(s.filterSize.x));
    message(kMsgVerbose, 6, "Filter Height : %f", double(s.filterSize.y));
    if (s.motionSamples > 0)
        message(kMsgInfo, 6, "Using Motion Blur with %d samples", int(s.motionSamples));
    message(kMsgInfo, 6, "Using DOF with %d samples", lensSide_ * lensSide_);
}

void ImageSampler::reportEnd(const Counters &total) const {
    message(kMsgInfo, 6, "Samples taken per pixel: %f",
            total.pixels > 0 ? double(total.samples) / double(total.pixels) : 0.0);
}

bool ImageSampler::differs(const ImageSample &a, const ImageSample &b) const {
    if (traceEdges_ && a.object != b.object) return true;
    Color ca = a.color, cb = b.color;
    if (settings_.clamp) {
        const float lo = settings_.minValue, hi = settings_.maxValue;
        ca = {clampChannel(ca.r, lo, hi), clampChannel(ca.g, lo, hi), clampChannel(ca.b, lo, hi),
              clampChannel(ca.a, lo, hi)};
        cb = {clampChannel(cb.r, lo, hi), clampChannel(cb.g, lo, hi), clampChannel(cb.b, lo, hi),
              clampChannel(cb.a, lo, hi)};
    }
    const float d = std::max(std::max(std::fabs(ca.r - cb.r), std::fabs(ca.g - cb.g)),
                             std::max(std::fabs(ca.b - cb.b), std::fabs(ca.a - cb.a)));
    // NaN colours count as different, so that they are refined and not spread.
    return !(d <= settings_.contrast);
}

void ImageSampler::beginBlock(Scratch &s, int32_t x0, int32_t y0, int32_t x1, int32_t y1) const {
    const float rx = 0.5f * settings_.filterSize.x, ry = 0.5f * settings_.filterSize.y;
    const float edge = traceEdges_ ? fine_ : 0.0f;
    // The pixels whose samples the block's filters and edge probes read.
    s.ex0 = float(x0) + 0.5f - rx - edge;
    s.ex1 = float(x1) + 0.5f + rx + edge;
    s.ey0 = float(y0) + 0.5f - ry - edge;
    s.ey1 = float(y1) + 0.5f + ry + edge;
    // Coarse cells over that area, with one more ring for the refinement's comparisons.
    const int32_t ring = levels_ > 0 ? 1 : 0;
    const float hc = coarse_;
    s.cx0 = int32_t(std::floor(s.ex0 / hc)) - ring;
    s.cy0 = int32_t(std::floor(s.ey0 / hc)) - ring;
    const int32_t cx1 = int32_t(std::ceil(s.ex1 / hc)) - 1 + ring;
    const int32_t cy1 = int32_t(std::ceil(s.ey1 / hc)) - 1 + ring;
    const int32_t span = 1 << levels_;
    s.gw = (cx1 - s.cx0 + 1) * span;
    s.gh = (cy1 - s.cy0 + 1) * span;
    s.ox = float(s.cx0) * hc;
    s.oy = float(s.cy0) * hc;
    s.leaves.clear();
    s.pending.clear();
    s.grid.assign(size_t(s.gw) * size_t(s.gh), -1);
    for (int32_t cy = s.cy0; cy <= cy1; ++cy)
        for (int32_t cx = s.cx0; cx <= cx1; ++cx) {
            Leaf leaf;
            leaf.fx = (cx - s.cx0) * span;
            leaf.fy = (cy - s.cy0) * span;
            leaf.size = span;
            const int32_t index = int32_t(s.leaves.size());
            s.leaves.push_back(leaf);
            s.pending.push_back(index);
        }
    // Positions, bounds and grid entries.
    for (int32_t index : s.pending) {
        Leaf &leaf = s.leaves[size_t(index)];
        leaf.xl = s.ox + float(leaf.fx) * fine_;
        leaf.yb = s.oy + float(leaf.fy) * fine_;
        leaf.xr = leaf.xl + hc;
        leaf.yt = leaf.yb + hc;
        float u = 0.5f, v = 0.5f;
        if (pattern_ == Pattern::kJittered) {
            const uint32_t h = cellHash(int64_t(s.cx0) * span + leaf.fx,
                                        int64_t(s.cy0) * span + leaf.fy, leaf.size);
            u = (float(h & 0xFFFFu) + 0.5f) * (1.0f / 65536.0f);
            v = (float(h >> 16) + 0.5f) * (1.0f / 65536.0f);
        }
        leaf.sx = leaf.wx = leaf.xl + u * hc;
        leaf.sy = leaf.wy = leaf.yb + v * hc;
        for (int32_t y = leaf.fy; y < leaf.fy + span; ++y)
            std::fill_n(s.grid.begin() + size_t(y) * size_t(s.gw) + size_t(leaf.fx), span, index);
    }
}

bool ImageSampler::refineLevel(Scratch &s, int32_t level) const {
    const int32_t size = (1 << levels_) >> level;
    const size_t count = s.leaves.size();
    s.refine.clear();
    for (size_t i = 0; i < count; ++i) {
        const Leaf &leaf = s.leaves[i];
        if (leaf.size != size || leaf.xr <= s.ex0 || leaf.xl >= s.ex1 || leaf.yt <= s.ey0 ||
            leaf.yb >= s.ey1)
            continue;
        bool split = false;
        int32_t last = int32_t(i);
        auto look = [&](int32_t x, int32_t y) {
            if (split || x < 0 || y < 0 || x >= s.gw || y >= s.gh) return;
            const int32_t other = s.grid[size_t(y) * size_t(s.gw) + size_t(x)];
            if (other < 0 || other == last) return;
            last = other;
            split = differs(leaf.sample, s.leaves[size_t(other)].sample);
        };
        for (int32_t k = 0; k < size && !split; ++k) {
            look(leaf.fx - 1, leaf.fy + k);
            look(leaf.fx + size, leaf.fy + k);
            look(leaf.fx + k, leaf.fy - 1);
            look(leaf.fx + k, leaf.fy + size);
        }
        if (split) s.refine.push_back(int32_t(i));
    }
    if (s.refine.empty()) return false;
    const int32_t half = size / 2;
    const float edge = float(half) * fine_;
    const int32_t span = 1 << levels_;
    for (int32_t parent : s.refine) {
        const Leaf base = s.leaves[size_t(parent)];
        for (int32_t c = 0; c < 4; ++c) {
            Leaf child;
            child.fx = base.fx + (c & 1) * half;
            child.fy = base.fy + (c >> 1) * half;
            child.size = half;
            child.xl = s.ox + float(child.fx) * fine_;
            child.yb = s.oy + float(child.fy) * fine_;
            child.xr = child.xl + edge;
            child.yt = child.yb + edge;
            float u = 0.5f, v = 0.5f;
            if (pattern_ == Pattern::kJittered) {
                const uint32_t h = cellHash(int64_t(s.cx0) * span + child.fx,
                                            int64_t(s.cy0) * span + child.fy, half);
                u = (float(h & 0xFFFFu) + 0.5f) * (1.0f / 65536.0f);
                v = (float(h >> 16) + 0.5f) * (1.0f / 65536.0f);
            }
            child.sx = child.wx = child.xl + u * edge;
            child.sy = child.wy = child.yb + v * edge;
            int32_t index = parent;
            if (c == 0) {
                s.leaves[size_t(parent)] = child;
            } else {
                index = int32_t(s.leaves.size());
                s.leaves.push_back(child);
            }
            s.pending.push_back(index);
            for (int32_t y = child.fy; y < child.fy + half; ++y)
                std::fill_n(s.grid.begin() + size_t(y) * size_t(s.gw) + size_t(child.fx), half,
                            index);
        }
    }
    return true;
}

void ImageSampler::findEdges(Scratch &s) const {
    s.edges.clear();
    static constexpr int kDx[8] = {1, -1, 0, 0, 1, -1, 1, -1};
    static constexpr int kDy[8] = {0, 0, 1, -1, 1, 1, -1, -1};
    for (size_t i = 0; i < s.leaves.size(); ++i) {
        const Leaf &a = s.leaves[i];
        if (a.size != 1 || a.xr <= s.ex0 || a.xl >= s.ex1 || a.yt <= s.ey0 || a.yb >= s.ey1)
            continue;
        EdgeCell cell;
        cell.leaf = int32_t(i);
        bool edge = false;
        for (int n = 0; n < 8; ++n) {
            const int32_t x = a.fx + kDx[n], y = a.fy + kDy[n];
            if (x < 0 || y < 0 || x >= s.gw || y >= s.gh) continue;
            const int32_t j = s.grid[size_t(y) * size_t(s.gw) + size_t(x)];
            if (j < 0) continue;
            cell.neighbours[n] = j;
            edge |= s.leaves[size_t(j)].sample.object != a.sample.object;
        }
        if (edge) s.edges.push_back(cell);
    }
}

void ImageSampler::applyEdges(Scratch &s) const {
    // After every cell has read its neighbours' own colours.
    for (const EdgeCell &e : s.edges) s.leaves[size_t(e.leaf)].sample.color = e.mixed;
}

void ImageSampler::filterBlock(Scratch &s, int32_t tileX, int32_t tileY, uint32_t rowLength,
                               int32_t x0, int32_t y0, int32_t x1, int32_t y1, Color *beauty,
                               float *depth) const {
    const float rx = 0.5f * settings_.filterSize.x, ry = 0.5f * settings_.filterSize.y;
    const float kx = 2.0f / rx, ky = 2.0f / ry;  // kernel offset per pixel
    const float inv = 1.0f / fine_;
    const bool box = filter_ == FilterKind::kBox;
    if (s.stamp.size() < s.leaves.size()) s.stamp.resize(s.leaves.size(), 0);
    for (int32_t y = y0; y <= y1; ++y) {
        const float pcy = float(y) + 0.5f;
        const float fy0 = pcy - ry, fy1 = pcy + ry;
        // The cells under the footprint; a cell outside it has no box overlap, and its weight
        // point lies outside the kernel's support.
        const int32_t j0 = std::max(0, int32_t(std::floor((fy0 - s.oy) * inv)));
        const int32_t j1 = std::min(s.gh - 1, int32_t(std::ceil((fy1 - s.oy) * inv)) - 1);
        for (int32_t x = x0; x <= x1; ++x) {
            const float pcx = float(x) + 0.5f;
            const float fx0 = pcx - rx, fx1 = pcx + rx;
            const int32_t i0 = std::max(0, int32_t(std::floor((fx0 - s.ox) * inv)));
            const int32_t i1 = std::min(s.gw - 1, int32_t(std::ceil((fx1 - s.ox) * inv)) - 1);
            if (++s.pixelStamp == 0) {
                std::fill(s.stamp.begin(), s.stamp.end(), 0u);
                s.pixelStamp = 1;
            }
            Color boxSum, kernelSum;
            float boxWeight = 0.0f, kernelWeight = 0.0f;
            bool background = false, object = false;
            for (int32_t j = j0; j <= j1; ++j) {
                const int32_t *row = s.grid.data() + size_t(j) * size_t(s.gw);
                for (int32_t i = i0; i <= i1; ++i) {
                    const int32_t id = row[i];
                    if (id < 0 || s.stamp[size_t(id)] == s.pixelStamp) continue;
                    s.stamp[size_t(id)] = s.pixelStamp;
                    const Leaf &leaf = s.leaves[size_t(id)];
                    const float ox = std::min(leaf.xr, fx1) - std::max(leaf.xl, fx0);
                    const float oy = std::min(leaf.yt, fy1) - std::max(leaf.yb, fy0);
                    if (ox > 0.0f && oy > 0.0f) {
                        const float w = ox * oy;
                        boxWeight += w;
                        boxSum += leaf.sample.color * w;
                        (leaf.sample.object < 0 ? background : object) = true;
                    }
                    if (!box) {
                        const float w = filterKernel(filter_, (leaf.wx - pcx) * kx) *
                                        filterKernel(filter_, (leaf.wy - pcy) * ky) *
                                        (leaf.xr - leaf.xl) * (leaf.yt - leaf.yb);
                        kernelWeight += w;
                        kernelSum += leaf.sample.color * w;
                    }
                }
            }
            // The cell under the pixel centre gives the depth (and the colour of hard edges).
            const int32_t ci = std::clamp(int32_t(std::floor((pcx - s.ox) * inv)), 0, s.gw - 1);
            const int32_t cj = std::clamp(int32_t(std::floor((pcy - s.oy) * inv)), 0, s.gh - 1);
            const Leaf &centre = s.leaves[size_t(s.grid[size_t(cj) * size_t(s.gw) + size_t(ci)])];
            Color c;
            if (settings_.hardEdges && background && object)
                c = centre.sample.color;
            else if (!box && kernelWeight > 0.0f)
                c = kernelSum * (1.0f / kernelWeight);
            else if (boxWeight > 0.0f)
                c = boxSum * (1.0f / boxWeight);  // the plain mean
            else
                c = centre.sample.color;
            const size_t out = size_t(y - tileY) * rowLength + size_t(x - tileX);
            beauty[out] = c;
            depth[out] = centre.sample.depth;
        }
    }
    s.counters.pixels += uint64_t(x1 - x0 + 1) * uint64_t(y1 - y0 + 1);
}

}  // namespace ox
