// The image sampler: filter kernels, sample placement, coverage of edges, refinement, the
// weight fall-back, hard edges, depth, and independence from the tile split.
#include "render/image_sampler.h"

#include <gtest/gtest.h>

#include <cmath>
#include <vector>

#include "render/tile.h"

namespace {

using ox::Color;
using ox::FilterKind;
using ox::ImageSample;
using ox::ImageSampler;
using ox::ImageSamplerSettings;
using ox::Tile;

/// An image made of a half-plane n . p < c (white, object 1, depth 2) over black background.
struct HalfPlane {
    float nx = 1.0f, ny = 0.0f, c = 0.0f;
    int samples = 0;
    std::vector<std::pair<float, float>> points = {};
    bool record = false;

    bool inside(float x, float y) const { return nx * x + ny * y < c; }
    ImageSample shade(float x, float y, ox::Vec2, float) {
        ++samples;
        if (record) points.emplace_back(x, y);
        if (inside(x, y)) return {Color(1, 1, 1, 1), 2.0f, 1};
        return {};
    }
    int32_t object(float x, float y) const { return inside(x, y) ? 1 : -1; }
};

/// A smooth image: colour from a function of the position, one object everywhere.
struct Smooth {
    float (*f)(float, float);
    int samples = 0;
    ImageSample shade(float x, float y, ox::Vec2, float) {
        ++samples;
        const float v = f(x, y);
        return {Color(v, v, v, 1), 1.0f, 0};
    }
    int32_t object(float, float) const { return 0; }
};

/// The exact area of the unit pixel (px, py) inside n . p < c (the square clipped by the line).
double coverage(const HalfPlane &h, int px, int py) {
    std::vector<std::pair<double, double>> poly = {
        {px, py}, {px + 1.0, py}, {px + 1.0, py + 1.0}, {px, py + 1.0}};
    std::vector<std::pair<double, double>> out;
    auto value = [&](const std::pair<double, double> &p) {
        return h.c - (h.nx * p.first + h.ny * p.second);
    };
    for (size_t i = 0; i < poly.size(); ++i) {
        const auto &a = poly[i];
        const auto &b = poly[(i + 1) % poly.size()];
        const double va = value(a), vb = value(b);
        if (va > 0) out.push_back(a);
        if ((va > 0) != (vb > 0)) {
            const double t = va / (va - vb);
            out.emplace_back(a.first + (b.first - a.first) * t,
                             a.second + (b.second - a.second) * t);
        }
    }
    double area = 0;
    for (size_t i = 0; i < out.size(); ++i) {
        const auto &a = out[i];
        const auto &b = out[(i + 1) % out.size()];
        area += a.first * b.second - b.first * a.second;
    }
    return std::fabs(area) * 0.5;
}

struct Image {
    std::vector<Color> beauty;
    std::vector<float> depth;
    int w = 0;
    const Color &at(int x, int y) const { return beauty[size_t(y * w + x)]; }
};

/// Renders a w x h image in tiles of tileSize.
template <class Shader>
Image render(const ImageSampler &sampler, Shader &shader, int w, int h, int tileSize = 64) {
    Image img;
    img.w = w;
    img.beauty.resize(size_t(w * h));
    img.depth.resize(size_t(w * h));
    ImageSampler::Scratch scratch;
    for (int ty = 0; ty < h; ty += tileSize)
        for (int tx = 0; tx < w; tx += tileSize) {
            Tile tile{uint32_t(tx), uint32_t(std::min(w, tx + tileSize) - 1), uint32_t(ty),
                      uint32_t(std::min(h, ty + tileSize) - 1), true};
            std::vector<Color> b(tile.width() * tile.height());
            std::vector<float> d(b.size());
            sampler.renderTile(tile.xMin, tile.xMax, tile.yMin, tile.yMax, shader, scratch,
                               b.data(), d.data());
            for (uint32_t y = 0; y < tile.height(); ++y)
                for (uint32_t x = 0; x < tile.width(); ++x) {
                    const size_t to = size_t(tile.yMin + y) * size_t(w) + tile.xMin + x;
                    img.beauty[to] = b[y * tile.width() + x];
                    img.depth[to] = d[y * tile.width() + x];
                }
        }
    return img;
}

ImageSamplerSettings superSampling(int minRate, int maxRate, FilterKind filter = FilterKind::kBox) {
    ImageSamplerSettings s;
    s.samplingMode = 2;
    s.minSampleRate = minRate;
    s.maxSampleRate = maxRate;
    s.filter = int32_t(filter);
    return s;
}

TEST(FilterKernel, ValuesAndPartitionOfUnity) {
    const struct {
        FilterKind kind;
        float x, value;
    } values[] = {
        {FilterKind::kBox, 0.0f, 1.0f},
        {FilterKind::kBox, -2.0f, 1.0f},
        {FilterKind::kBox, 2.0f, 0.0f},
        {FilterKind::kTriangle, 1.0f, 0.5f},
        {FilterKind::kTriangle, -1.5f, 0.25f},
        {FilterKind::kCubic, 0.0f, 4.0f / 6.0f},
        {FilterKind::kCubic, 1.0f, 1.0f / 6.0f},
        {FilterKind::kCubic, -1.0f, 1.0f / 6.0f},
        {FilterKind::kGauss, 1.0f, std::exp(-1.0f)},
        {FilterKind::kCatmullRom, 0.0f, 1.0f},
        {FilterKind::kCatmullRom, 1.0f, 0.0f},
        {FilterKind::kCatmullRom, -1.0f, 0.0f},
        {FilterKind::kLanczos, 0.0f, 1.0f},
        {FilterKind::kTavik, 0.0f, 0.0f},
        {FilterKind::kTavik, -1.0f, 0.5f},
        {FilterKind::kMitchell, 0.0f, 8.0f / 9.0f},
        {FilterKind::kMitchell, 1.0f, 1.0f / 18.0f},
        {FilterKind::kMitchell, 1.999f, 0.0f},
    };
    for (const auto &v : values)
        EXPECT_NEAR(ox::filterKernel(v.kind, v.x), v.value, 1e-4f)
            << ox::filterName(v.kind) << " at " << v.x;
    const float l = 0.5f;
    EXPECT_NEAR(ox::filterKernel(FilterKind::kLanczos, l),
                std::sin(1.099525f * l) * std::sin(6.283f * 0.35f * l) /
                    (19.738045f * 0.35f * 0.35f * l * l),
                1e-6f);
    // The cubic B-spline, Catmull-Rom and Mitchell kernels sum to one over integer shifts, so
    // a flat image stays flat; every kernel vanishes outside [-2, 2).
    for (FilterKind k : {FilterKind::kCubic, FilterKind::kCatmullRom, FilterKind::kMitchell})
        for (float x : {0.0f, 0.25f, 0.5f, 0.9f}) {
            float sum = 0;
            for (int s = -3; s <= 3; ++s) sum += ox::filterKernel(k, x + float(s));
            EXPECT_NEAR(sum, 1.0f, 1e-5f) << ox::filterName(k) << " at " << x;
        }
    for (int k = 0; k < 8; ++k)
        for (float x : {-2.01f, 2.0f, 7.0f, NAN})
            EXPECT_EQ(ox::filterKernel(FilterKind(k), x), 0.0f) << k << " " << x;
}

TEST(ImageSampler, OneSamplePerPixelAtRateZeroLiesAtTheCentre) {
    ImageSamplerSettings s = superSampling(0, 0);
    s.edgeTracing = false;
    auto sampler = ox::createImageSampler(s);
    EXPECT_STREQ(sampler->name(), "AdaptiveEdgeSuperSampling");
    HalfPlane h{1, 0, 3.0f};
    h.record = true;
    const Image img = render(*sampler, h, 8, 8);
    ASSERT_EQ(h.points.size(), 64u);
    for (const auto &[x, y] : h.points) {
        EXPECT_EQ(x - std::floor(x), 0.5f);
        EXPECT_EQ(y - std::floor(y), 0.5f);
    }
    // Pixels whose centre lies left of x = 3 are white and carry the depth; the rest are
    // background with depth -1.
    for (int y = 0; y < 8; ++y)
        for (int x = 0; x < 8; ++x) {
            EXPECT_EQ(img.at(x, y).r, x < 3 ? 1.0f : 0.0f);
            EXPECT_EQ(img.depth[size_t(y * 8 + x)], x < 3 ? 2.0f : -1.0f);
        }
}

TEST(ImageSampler, EdgeCoverageWithinTwoPercentAtRateTwo) {
    auto sampler = ox::createImageSampler(superSampling(2, 2));
    // Vertical, horizontal and oblique edges at offsets that fall between the samples.
    const HalfPlane edges[] = {{1.0f, 0.0f, 3.37f},
                               {0.0f, 1.0f, 4.81f},
                               {std::cos(0.5f), std::sin(0.5f), 4.13f},
                               {std::cos(2.2f), std::sin(2.2f), 0.71f},
                               {std::cos(0.785f), std::sin(0.785f), 5.0f}};
    for (HalfPlane h : edges) {
        const Image img = render(*sampler, h, 10, 10);
        double worst = 0;
        for (int y = 0; y < 10; ++y)
            for (int x = 0; x < 10; ++x)
                worst = std::max(worst, std::fabs(img.at(x, y).r - coverage(h, x, y)));
        EXPECT_LT(worst, 0.02) << h.nx << " " << h.ny << " " << h.c;
    }
    // Without edge tracing the same samples only see sixteenths.
    ImageSamplerSettings plain = superSampling(2, 2);
    plain.edgeTracing = false;
    HalfPlane v{1.0f, 0.0f, 3.37f};
    const Image img = render(*ox::createImageSampler(plain), v, 8, 8);
    EXPECT_FLOAT_EQ(img.at(3, 0).r, 0.25f);
}

TEST(ImageSampler, FlatImagesStayFlatWithEveryFilterAndRate) {
    Smooth flat{[](float, float) { return 0.7f; }};
    for (int k = 0; k < 8; ++k)
        for (const auto &rates : {std::pair{0, 0}, std::pair{2, 2}, std::pair{-2, 0}}) {
            ImageSamplerSettings s = superSampling(rates.first, rates.second, FilterKind(k));
            s.filterSize = ox::Vec2{2.5f, 1.5f};
            for (int mode : {1, 2}) {
                s.samplingMode = mode;
                const Image img = render(*ox::createImageSampler(s), flat, 9, 7, 4);
                for (const Color &c : img.beauty) ASSERT_NEAR(c.r, 0.7f, 1e-5f) << k;
            }
        }
}

TEST(ImageSampler, RefinesOnlyWhereNeighboursDiffer) {
    // A flat image takes one sample per 4 x 4 block (and the ring around each block).
    Smooth flat{[](float, float) { return 0.5f; }};
    ImageSamplerSettings s = superSampling(-2, 2);
    s.edgeTracing = false;
    auto sampler = ox::createImageSampler(s);
    render(*sampler, flat, 32, 32);
    EXPECT_LE(flat.samples, 10 * 10);
    // A step at x = 16.3: the columns next to it are refined to 16 samples per pixel, so the
    // pixel it crosses shows its coverage to a sixteenth; pixels away from it keep their value.
    Smooth step{[](float x, float) { return x < 16.3f ? 1.0f : 0.0f; }};
    const Image img = render(*sampler, step, 32, 32);
    EXPECT_LT(step.samples, 32 * 32 * 4);
    for (int y = 0; y < 32; ++y) {
        EXPECT_NEAR(img.at(16, y).r, 0.25f, 1e-6f);
        EXPECT_EQ(img.at(15, y).r, 1.0f);
        EXPECT_EQ(img.at(17, y).r, 0.0f);
        EXPECT_EQ(img.at(2, y).r, 1.0f);
        EXPECT_EQ(img.at(30, y).r, 0.0f);
    }
    // With a contrast above the step nothing is refined: a block takes its one sample's value.
    s.contrast = 2.0f;
    const Image coarse = render(*ox::createImageSampler(s), step, 32, 32);
    for (int x = 16; x < 20; ++x) EXPECT_EQ(coarse.at(x, 5).r, coarse.at(16, 4).r);
    // Clamping before the comparison hides differences above maxValue.
    Smooth bright{[](float x, float) { return x < 16.3f ? 5.0f : 1.5f; }};
    s.contrast = 0.1f;
    s.clamp = true;
    bright.samples = 0;
    render(*ox::createImageSampler(s), bright, 32, 32);
    EXPECT_LE(bright.samples, 10 * 10);
}

TEST(ImageSampler, WeightsThatSumToZeroFallBackToThePlainMean) {
    // Tavik weighs the pixel centre with 0: at one sample per pixel each pixel keeps its own.
    Smooth ramp{[](float x, float y) { return x * 0.1f + y; }};
    ImageSamplerSettings s = superSampling(0, 0, FilterKind::kTavik);
    s.edgeTracing = false;
    const Image img = render(*ox::createImageSampler(s), ramp, 6, 6);
    for (int y = 0; y < 6; ++y)
        for (int x = 0; x < 6; ++x)
            EXPECT_FLOAT_EQ(img.at(x, y).r, (float(x) + 0.5f) * 0.1f + float(y) + 0.5f);
}

TEST(ImageSampler, HardEdgesKeepTheCentreSample) {
    ImageSamplerSettings s = superSampling(2, 2);
    s.hardEdges = true;
    HalfPlane v{1.0f, 0.0f, 3.37f};
    const Image img = render(*ox::createImageSampler(s), v, 8, 8);
    EXPECT_EQ(img.at(3, 2).r, 0.0f);  // the centre 3.5 lies outside
    HalfPlane w{1.0f, 0.0f, 3.7f};
    EXPECT_EQ(render(*ox::createImageSampler(s), w, 8, 8).at(3, 2).r, 1.0f);
}

TEST(ImageSampler, PixelsDoNotDependOnTheTileSplit) {
    // Jittered samples with a wide Gauss filter, at fixed rates: the lattice is global, so any
    // tile split gives the same bytes.
    Smooth wave{[](float x, float y) { return std::sin(x * 0.7f) * std::cos(y * 0.3f); }};
    ImageSamplerSettings s;
    s.samplingMode = 1;
    s.minSampleRate = s.maxSampleRate = 1;
    s.filter = int32_t(FilterKind::kCubic);  // Gauss for the adaptive sampler
    s.filterSize = ox::Vec2{3.0f, 3.0f};
    auto sampler = ox::createImageSampler(s);
    EXPECT_EQ(sampler->filterKind(), FilterKind::kGauss);
    const Image whole = render(*sampler, wave, 40, 24, 64);
    const Image tiled = render(*sampler, wave, 40, 24, 7);
    for (size_t i = 0; i < whole.beauty.size(); ++i) ASSERT_EQ(whole.beauty[i], tiled.beauty[i]);
}

TEST(ImageSampler, SettingsOutsideTheirRangeAreClamped) {
    ImageSamplerSettings s = superSampling(9, -9);
    s.filterSize = ox::Vec2{0.0f, NAN};
    s.lensSamples = 10;  // 3 x 3
    s.motionSamples = 2;
    auto sampler = ox::createImageSampler(s);
    EXPECT_EQ(sampler->settings().minSampleRate, ox::kMaxSampleRate);
    EXPECT_EQ(sampler->settings().maxSampleRate, ox::kMaxSampleRate);
    EXPECT_EQ(sampler->settings().filterSize, (ox::Vec2{1.0f, 1.0f}));
    EXPECT_EQ(sampler->lensSide(), 3);
    // Lens and time samples are averaged into each image sample.
    struct Lens {
        int calls = 0;
        ImageSample shade(float, float, ox::Vec2 lens, float time) {
            ++calls;
            return {Color(lens.x, lens.y, time, 1), 1.0f, 0};
        }
        int32_t object(float, float) const { return 0; }
    } lens;
    ImageSamplerSettings d = superSampling(0, 0);
    d.edgeTracing = false;
    d.lensSamples = 4;
    d.motionSamples = 2;
    const Image img = render(*ox::createImageSampler(d), lens, 2, 2);
    EXPECT_EQ(lens.calls, 4 * 4 * 2);
    EXPECT_FLOAT_EQ(img.at(1, 1).r, 0.5f);
    EXPECT_FLOAT_EQ(img.at(1, 1).b, 0.5f);
}

}  // namespace
