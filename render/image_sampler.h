#pragma once

#include <algorithm>
#include <cstdint>
#include <memory>
#include <vector>

#include "core/types.h"
#include "render/image_filter.h"

/// The image sampler of camera renders: chooses image points for every pixel of a tile between
/// the minimum and maximum sample rate, refines where neighbouring samples differ, traces
/// object edges, and filters the samples into the pixels of the "beauty" and "Z" layers.
///
/// A rate r means 4^r samples per pixel: 2^r x 2^r for r >= 0, one sample per 2^-r x 2^-r
/// block of pixels for r < 0. Samples lie on one lattice over the whole image (cells of 2^-r
/// pixels at rate r), so a pixel gets the same samples whichever tile renders it.
namespace ox {

/// One shaded image sample.
struct ImageSample {
    Color color;          ///< colour; background samples have alpha 0
    float depth = -1.0f;  ///< distance along the ray; -1 when nothing was hit
    int32_t object = -1;  ///< what was hit (-1 = background); edges lie between objects
};

/// The sampler's settings (the antialiasing settings and the motion and lens sample counts).
struct ImageSamplerSettings {
    int32_t samplingMode = 1;     ///< 1 "Adaptive", 2 "SuperSampling"
    int32_t minSampleRate = -2;   ///< rate of the first samples
    int32_t maxSampleRate = 0;    ///< rate that refinement may reach
    float contrast = 0.1f;        ///< largest channel difference between neighbours left alone
    bool edgeTracing = true;      ///< SuperSampling: refine and trace edges between objects
    bool hardEdges = false;       ///< pixels holding background and objects are not blended
    bool clamp = false;           ///< clamp colours to [minValue, maxValue] before comparing
    float minValue = 0.0f;        ///< lower clamp bound
    float maxValue = 1.0f;        ///< upper clamp bound
    int32_t filter = 0;           ///< FilterKind value
    Vec2 filterSize{1.0f, 1.0f};  ///< filter width and height in pixels
    uint32_t motionSamples = 0;   ///< time samples per image sample (0 = motion blur off)
    uint32_t lensSamples = 0;     ///< lens samples s: n x n with n = max(1, floor(sqrt(s)))
};

/// The lowest and highest rate the sampler accepts; settings outside are clamped with a warning.
constexpr int32_t kMinSampleRate = -4;
constexpr int32_t kMaxSampleRate = 4;
/// Tiles are sampled in blocks of at most this many pixels per side.
constexpr int32_t kSamplerBlock = 32;
/// Edge tracing probes each finest cell on an object edge at this many points, to find how much
/// of the cell each object covers.
constexpr int kEdgeProbes = 16;

/// The image sampler. Coarse object made once per run; renderTile is called concurrently with
/// one Scratch per thread.
///
/// Shader provides `ImageSample shade(float x, float y, Vec2 lens, float time)` for a point in
/// pixel coordinates (row 0 at the bottom; pixel (i, j) covers [i, i + 1) x [j, j + 1)), a lens
/// point in [0, 1]^2 and a shutter time in [0, 1], and `int32_t object(float x, float y)` giving
/// only what the pinhole ray through the point hits.
class ImageSampler {
public:
    /// Where samples lie inside their cells.
    enum class Pattern { kJittered, kRegular };

    /// Per-thread counts, summed at the end of the run.
    struct Counters {
        uint64_t samples = 0;  ///< image samples shaded (lens and time samples not counted)
        uint64_t probes = 0;   ///< edge-tracing probes
        uint64_t pixels = 0;   ///< pixels written
        void merge(const Counters &o) {
            samples += o.samples, probes += o.probes, pixels += o.pixels;
        }
    };

    /// A sample with its cell: lattice position and size in finest-lattice units, the sample
    /// point, the point kernels weigh it at, and the cell bounds in pixels.
    struct Leaf {
        int32_t fx = 0, fy = 0, size = 1;
        float sx = 0, sy = 0;
        float wx = 0, wy = 0;
        float xl = 0, xr = 0, yb = 0, yt = 0;
        ImageSample sample;
    };
    /// A finest cell with a neighbour on another object; its colour becomes the mix of its own
    /// and its neighbours' colours in the proportions the probes find.
    struct EdgeCell {
        int32_t leaf = 0;
        int32_t neighbours[8] = {-1, -1, -1, -1, -1, -1, -1, -1};  ///< sides first, then corners
        Color mixed;
    };

    /// Per-thread working memory, reused from tile to tile.
    struct Scratch {
        std::vector<Leaf> leaves;
        std::vector<int32_t> grid;     ///< finest-lattice entry -> leaf index
        std::vector<uint32_t> stamp;   ///< per leaf: last pixel that counted it
        std::vector<int32_t> pending;  ///< leaves waiting to be shaded
        std::vector<int32_t> refine;   ///< leaves to split
        std::vector<EdgeCell> edges;
        int32_t gw = 0, gh = 0;                    ///< grid size in finest units
        int32_t cx0 = 0, cy0 = 0;                  ///< first coarse cell of the grid
        float ox = 0, oy = 0;                      ///< pixel position of the grid origin
        float ex0 = 0, ex1 = 0, ey0 = 0, ey1 = 0;  ///< pixels whose samples the block needs
        uint32_t pixelStamp = 0;
        Counters counters;
    };

    virtual ~ImageSampler() = default;

    /// The class name ("AdaptiveLDAA", "AdaptiveEdgeSuperSampling").
    virtual const char *name() const = 0;

    /// Samples, shades and filters the pixels of the tile [xMin..xMax] x [yMin..yMax]
    /// (inclusive) into beauty and depth, row-major from row yMin, xMax - xMin + 1 per row.
    template <class Shader>
    void renderTile(uint32_t xMin, uint32_t xMax, uint32_t yMin, uint32_t yMax, Shader &shader,
                    Scratch &scratch, Color *beauty, float *depth) const;

    /// Reports the set-up as info messages (rates, sample counts, contrast, filter).
    void reportSetup() const;
    /// Reports "Samples taken per pixel: %f" for the run's summed counters.
    void reportEnd(const Counters &total) const;

    /// The settings after clamping.
    const ImageSamplerSettings &settings() const { return settings_; }
    /// The kernel the samples are weighted with.
    FilterKind filterKind() const { return filter_; }
    /// Lens samples per side (1 = no depth of field).
    int32_t lensSide() const { return lensSide_; }

protected:
    ImageSampler(const ImageSamplerSettings &settings, Pattern pattern, FilterKind filter);

private:
    template <class Shader>
    ImageSample shadeAt(Shader &shader, float x, float y) const;
    template <class Shader>
    void shadePending(Shader &shader, Scratch &s) const;

    /// Lays out the lattice for the block and queues its coarse samples.
    void beginBlock(Scratch &s, int32_t x0, int32_t y0, int32_t x1, int32_t y1) const;
    /// Queues the children of every cell of refinement level `level` that differs from a
    /// neighbour; false when none does.
    bool refineLevel(Scratch &s, int32_t level) const;
    /// Lists the finest cells with a neighbour on another object.
    void findEdges(Scratch &s) const;
    /// Gives the edge cells their mixed colours.
    void applyEdges(Scratch &s) const;
    /// Filters the block's pixels into the tile's buffers.
    void filterBlock(Scratch &s, int32_t tileX, int32_t tileY, uint32_t rowLength, int32_t x0,
                     int32_t y0, int32_t x1, int32_t y1, Color *beauty, float *depth) const;
    /// True when two samples differ enough to refine between them.
    bool differs(const ImageSample &a, const ImageSample &b) const;

    ImageSamplerSettings settings_;
    Pattern pattern_;
    FilterKind filter_;
    bool traceEdges_;
    int32_t lensSide_ = 1;
    int32_t timeCount_ = 1;
    float fine_ = 1.0f;    // finest cell edge in pixels
    float coarse_ = 1.0f;  // first cell edge in pixels
    int32_t levels_ = 0;   // maxRate - minRate
};

/// "Adaptive": jittered samples, refined where neighbours differ by more than the contrast;
/// Box, Triangle or (for every other filter) Gauss weights.
class AdaptiveLDAA final : public ImageSampler {
public:
    explicit AdaptiveLDAA(const ImageSamplerSettings &settings);
    const char *name() const override { return "AdaptiveLDAA"; }
};

/// "SuperSampling": samples at cell centres, refined where neighbours differ by more than the
/// contrast and, with edgeTracing, between different objects; the finest cells on an object
/// edge are then probed to mix the colours of the objects in the proportions they cover.
class AdaptiveEdgeSuperSampling final : public ImageSampler {
public:
    explicit AdaptiveEdgeSuperSampling(const ImageSamplerSettings &settings);
    const char *name() const override { return "AdaptiveEdgeSuperSampling"; }
};

/// The sampler samplingMode asks for: 2 gives AdaptiveEdgeSuperSampling, every other value
/// AdaptiveLDAA.
std::unique_ptr<ImageSampler> createImageSampler(const ImageSamplerSettings &settings);

// ---------------------------------------------------------------------------------------------

/// The probe points of an edge cell (in cell units): a 16-point Hammersley set, so that every
/// column and every row of sixteenths holds one point.
inline constexpr float kProbeX[kEdgeProbes] = {
    1 / 32.f,  3 / 32.f,  5 / 32.f,  7 / 32.f,  9 / 32.f,  11 / 32.f, 13 / 32.f, 15 / 32.f,
    17 / 32.f, 19 / 32.f, 21 / 32.f, 23 / 32.f, 25 / 32.f, 27 / 32.f, 29 / 32.f, 31 / 32.f};
inline constexpr float kProbeY[kEdgeProbes] = {
    1 / 32.f, 17 / 32.f, 9 / 32.f,  25 / 32.f, 5 / 32.f, 21 / 32.f, 13 / 32.f, 29 / 32.f,
    3 / 32.f, 19 / 32.f, 11 / 32.f, 27 / 32.f, 7 / 32.f, 23 / 32.f, 15 / 32.f, 31 / 32.f};

template <class Shader>
ImageSample ImageSampler::shadeAt(Shader &shader, float x, float y) const {
    if (lensSide_ == 1 && timeCount_ == 1) return shader.shade(x, y, Vec2{0.5f, 0.5f}, 0.0f);
    // Depth of field and motion blur: the mean colour of stratified lens and time samples;
    // depth and object come from the first.
    ImageSample first;
    Color sum;
    const float lensStep = 1.0f / float(lensSide_);
    const float timeStep = 1.0f / float(timeCount_);
    int n = 0;
    for (int32_t t = 0; t < timeCount_; ++t)
        for (int32_t j = 0; j < lensSide_; ++j)
            for (int32_t i = 0; i < lensSide_; ++i) {
                const float time = timeCount_ > 1 ? (float(t) + 0.5f) * timeStep : 0.0f;
                const ImageSample s = shader.shade(
                    x, y, Vec2{(float(i) + 0.5f) * lensStep, (float(j) + 0.5f) * lensStep}, time);
                if (n++ == 0) first = s;
                sum += s.color;
            }
    first.color = sum * (1.0f / float(n));
    return first;
}

template <class Shader>
void ImageSampler::shadePending(Shader &shader, Scratch &s) const {
    for (int32_t index : s.pending) {
        Leaf &leaf = s.leaves[size_t(index)];
        leaf.sample = shadeAt(shader, leaf.sx, leaf.sy);
    }
    s.counters.samples += s.pending.size();
    s.pending.clear();
}

template <class Shader>
void ImageSampler::renderTile(uint32_t xMin, uint32_t xMax, uint32_t yMin, uint32_t yMax,
                              Shader &shader, Scratch &s, Color *beauty, float *depth) const {
    for (uint32_t by = yMin; by <= yMax; by += kSamplerBlock) {
        const uint32_t by1 = std::min(yMax, by + kSamplerBlock - 1);
        for (uint32_t bx = xMin; bx <= xMax; bx += kSamplerBlock) {
            const uint32_t bx1 = std::min(xMax, bx + kSamplerBlock - 1);
            beginBlock(s, int32_t(bx), int32_t(by), int32_t(bx1), int32_t(by1));
            shadePending(shader, s);
            for (int32_t level = 0; level < levels_; ++level) {
                if (!refineLevel(s, level)) break;
                shadePending(shader, s);
            }
            if (traceEdges_) {
                findEdges(s);
                for (EdgeCell &e : s.edges) {
                    const Leaf &leaf = s.leaves[size_t(e.leaf)];
                    float weight[9] = {};  // own colour, then the neighbours'
                    for (int k = 0; k < kEdgeProbes; ++k) {
                        const int32_t id = shader.object(leaf.xl + kProbeX[k] * fine_,
                                                         leaf.yb + kProbeY[k] * fine_);
                        int slot = 0;
                        // Hard edges never blend background into objects or back.
                        const bool hard = settings_.hardEdges && (id < 0 || leaf.sample.object < 0);
                        if (id != leaf.sample.object && !hard)
                            for (int n = 0; n < 8; ++n)
                                if (e.neighbours[n] >= 0 &&
                                    s.leaves[size_t(e.neighbours[n])].sample.object == id) {
                                    slot = n + 1;
                                    break;
                                }
                        weight[slot] += 1.0f / float(kEdgeProbes);
                    }
                    e.mixed = leaf.sample.color * weight[0];
                    for (int n = 0; n < 8; ++n)
                        if (weight[n + 1] > 0.0f)
                            e.mixed +=
                                s.leaves[size_t(e.neighbours[n])].sample.color * weight[n + 1];
                }
                s.counters.probes += uint64_t(s.edges.size()) * kEdgeProbes;
                applyEdges(s);
            }
            filterBlock(s, int32_t(xMin), int32_t(yMin), xMax - xMin + 1, int32_t(bx), int32_t(by),
                        int32_t(bx1), int32_t(by1), beauty, depth);
            if (bx1 == xMax) break;
        }
        if (by1 == yMax) break;
    }
}

}  // namespace ox
