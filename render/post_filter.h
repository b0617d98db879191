#pragma once

#include <algorithm>
#include <atomic>
#include <cstdint>
#include <cstring>
#include <functional>
#include <memory>
#include <new>
#include <string>
#include <vector>

#include "config/settings_bake.h"
#include "core/render_io.h"
#include "core/types.h"
#include "render/command.h"
#include "render/frame.h"
#include "render/layer.h"

#ifdef __SSE2__
#include <emmintrin.h>
#endif

/// Post filters: the commands that transform a rendered or baked frame's layers before it is
/// written (premultiply, edge dilation, shape normalization, range remap, RNM fold).
///
/// Using them (a bake target's command list):
///
///     executor.add(std::make_unique<PostFilterCommand>(         // pixel filters
///         std::make_unique<PremultiplyFilter>(passNames, 0.0f, Color::black()), threads));
///     auto dilation = std::make_unique<EdgeDilationFilter>(passNames, edgeDilation, bg);
///     dilation->setThreadCount(threads);                          // frame filters
///     executor.add(std::move(dilation));
///     auto normalize = std::make_unique<ShapeNormalizationFilter>(pass, options, &instances);
///     normalize->setRecordFile(outputDirectory + "..._minmax.xml");  // optional
///     executor.add(std::move(normalize));
///     executor.add(std::make_unique<PostFilterCommand>(std::make_unique<RNMAverageMaxFilter>(
///         {pass, pass + "_1", pass + "_2"}, {pass, pass + "_max"}), threads));
///
/// The executor runs them in order on the target's frame (execute(frame, context, io)); the
/// frame filters also have run(frame, io) for callers without a render context.
///
/// Every filter reads its source layers by name and writes its results into new layers (the
/// source name plus a suffix, or "temp"); only when the whole frame is done are the sources
/// deleted and the results renamed to the source names, so the next command finds the filtered
/// layer under the old name. A failure or an abort (through the io's isAborted, checked between
/// bands of rows, progress reported every tenth) removes the unfinished result layers and
/// leaves the sources untouched. Premultiply and shape normalization, which change only some
/// texels, rewrite those in the source's tiles instead when the source allows it (see
/// InPlaceTexels): the originals are kept until the end and go back on a failure or an abort,
/// and the result names must be free all the same. Results do not depend on the thread count.
namespace ox {

/// The rows of a band of filter work: one tile row of the frame's tiled layers, so that every
/// tile is loaded once per band.
constexpr int32_t kFilterBandRows = kLayerTileSize;

/// Grows `block`, borrowed from `pool`, to hold at least n values of T (its contents are lost
/// when it grows) and returns it. Throws std::bad_alloc when the memory cannot be had: inside
/// a RowBands body that fails the run like a false return.
template <typename T>
T *scratchArray(ScratchPool &pool, ScratchBlock &block, size_t n) {
    if (block.bytes() < n * sizeof(T)) {
        block.reset();
        block = pool.borrow(n * sizeof(T));
        if (!block.as<T>()) throw std::bad_alloc();
    }
    return block.as<T>();
}

/// Buffers of one thread's band work, kept from band to band (and, through the frame's
/// scratch pool, from filter to filter) so that large bands do not fault in fresh pages.
struct BandScratch {
    explicit BandScratch(ScratchPool &p) : pool(&p) {}
    ScratchPool *pool;
    ScratchBlock colors, floats;

    /// colors sized to at least n, returned.
    Color *colorBuffer(size_t n) { return scratchArray<Color>(*pool, colors, n); }
    /// floats sized to at least n, returned.
    float *floatBuffer(size_t n) { return scratchArray<float>(*pool, floats, n); }
};

/// Copies n colours to dst, a result in a layer's tiles that is written once and read only by
/// a later pass: the stores bypass the cache, so that dst's lines are not read in first.
/// Call streamFence before another thread reads them.
inline void streamColors(Color *dst, const Color *src, int32_t n) {
#ifdef __SSE2__
    if ((reinterpret_cast<uintptr_t>(dst) & 15) == 0) {
        for (int32_t i = 0; i < n; ++i) _mm_stream_ps(&dst[i].r, _mm_loadu_ps(&src[i].r));
        return;
    }
#endif
    std::memcpy(dst, src, size_t(n) * sizeof(Color));
}

/// Sets n colours at dst to c like streamColors.
inline void streamFill(Color *dst, const Color &c, int32_t n) {
#ifdef __SSE2__
    if ((reinterpret_cast<uintptr_t>(dst) & 15) == 0) {
        const __m128 v = _mm_loadu_ps(&c.r);
        for (int32_t i = 0; i < n; ++i) _mm_stream_ps(&dst[i].r, v);
        return;
    }
#endif
    std::fill(dst, dst + n, c);
}

/// Orders the streamed stores of this thread before what follows.
inline void streamFence() {
#ifdef __SSE2__
    _mm_sfence();
#endif
}

/// Hands the texels of bands of rows of a colour layer (with the same texels of an optional
/// "Z" layer and of an optional result layer) to a body in runs along rows: straight in the
/// layers' tiles when all of them keep addressable tiles cut the same way, else through band
/// buffers (read, then the result pasted). Made before the bands run; until it is destroyed
/// the layers are used only through it.
class TexelRuns {
public:
    /// in: the source; out: a result layer without observers, or null; z: depths, or null.
    TexelRuns(LayerT<Color> &in, LayerT<Color> *out, LayerT<float> *z);

    /// Calls body(x, y, n, src, dst, depth) for runs of n texels of row y from x, covering
    /// rows [y0, y1) once: src holds the source texels, dst receives their results (null
    /// without a result layer; it may be src, so read a texel before writing it), depth their
    /// "Z" (null without one). The runs come in no fixed order. False when a layer refused
    /// (the caller gives the message).
    template <typename F>
    bool run(int32_t y0, int32_t y1, BandScratch &scratch, F &&body);

private:
    LayerT<Color> &in_;
    LayerT<Color> *out_;
    LayerT<float> *z_;
    bool direct_ = false;
    TileGrid<Color> inGrid_, outGrid_;
    TileGrid<float> zGrid_;
};

/// Rewrites chosen texels of a colour layer straight in its tiles, keeping their originals so
/// that the layer can be put back as it was after an abort or a failure. A filter whose result
/// replaces its source thereby spares writing a whole new layer (and reading and writing every
/// texel it leaves alone). The choice of a texel must not depend on what the rewrite changes: it
/// is made again when the originals go back.
class InPlaceTexels {
public:
    /// True when the layer keeps addressable tiles and has no observers (writes through the
    /// tiles reach none).
    static bool possible(LayerT<Color> &layer);

    /// For a layer for which possible() holds. The room for the originals (as many as the
    /// layer has texels) is borrowed from pool; the originals are packed into it, so that only
    /// as much is touched as they take.
    InPlaceTexels(LayerT<Color> &layer, ScratchPool &pool);
    /// False when the room for the originals could not be had.
    bool ok() const { return log_.as<Color>() != nullptr; }

    /// Rewrites the chosen texels of rows [y0, y1) (disjoint for concurrent calls, each row
    /// once): chosen(x, y, c) picks a texel, rewrite(x, y, c) changes it. The originals pass
    /// through the calling thread's scratch.
    template <typename Chosen, typename Rewrite>
    void run(int32_t y0, int32_t y1, BandScratch &scratch, Chosen &&chosen, Rewrite &&rewrite);
    /// Puts back the originals of every row rewritten so far (no run may be going on).
    template <typename Chosen>
    void restore(Chosen &&chosen);
    /// Texel (x, y) in the layer's tiles (for single texels; their originals are the caller's).
    Color &at(int32_t x, int32_t y) const {
        const int32_t tx = x / grid_.tileWidth, ty = y / grid_.tileHeight;
        return grid_.tile(uint32_t(tx),
                          uint32_t(ty))[int64_t(y - ty * grid_.tileHeight) * grid_.tileWidth +
                                        (x - tx * grid_.tileWidth)];
    }

private:
    /// Calls f(x, y, texels of the run, n) for rows [y0, y1), tile by tile.
    template <typename F>
    void eachRun(int32_t y0, int32_t y1, F &&f) const {
        const int32_t tw = grid_.tileWidth, th = grid_.tileHeight;
        for (int32_t ty = y0 / th; ty * th < y1; ++ty) {
            const int32_t ya = std::max(y0, ty * th), yb = std::min(y1, (ty + 1) * th);
            for (int32_t x = 0, tx = 0; x < width_; x += tw, ++tx) {
                Color *tile = grid_.tile(uint32_t(tx), uint32_t(ty));
                const int32_t n = std::min(tw, width_ - x);
                for (int32_t y = ya; y < yb; ++y) f(x, y, tile + int64_t(y - ty * th) * tw, n);
            }
        }
    }

    int32_t width_, height_;
    TileGrid<Color> grid_;
    ScratchBlock log_;
    std::atomic<size_t> used_{0};  // originals in log_
    /// Per row y that starts a run: the end of its rows (0: none) and its first original.
    std::vector<int32_t> done_;
    std::vector<size_t> first_;
};

/// Runs a body over bands of rows of an image on a number of threads, with progress and abort.
class RowBands {
public:
    /// The body: rows [y0, y1) on thread `thread` (0 .. threadCount - 1); false stops the run.
    /// Called concurrently for disjoint bands.
    using Body = std::function<bool(int32_t y0, int32_t y1, int thread)>;

    /// height rows in bands of bandRows, on threadCount threads (the calling thread is one of
    /// them). With io, progress (rows done / height) is reported every tenth and the run stops
    /// between bands once io reports an abort.
    RowBands(int32_t height, int32_t bandRows, int threadCount, RenderIOInterface *io)
        : height_(height),
          bandRows_(bandRows < 1 ? 1 : bandRows),
          threads_(threadCount < 1 ? 1 : threadCount),
          io_(io) {}

    /// Runs the body over every band. False when a band failed (its message given by the
    /// body), a thread could not start, or the run was aborted (then aborted() is true).
    bool run(const Body &body);
    /// True when the last run stopped because of an abort.
    bool aborted() const { return aborted_; }

private:
    int32_t height_, bandRows_;
    int threads_;
    RenderIOInterface *io_;
    bool aborted_ = false;
};

/// The result layers of one filter run: created under temporary names, deleted again unless
/// placed. Placement deletes each source and renames its result to the source's name.
class FilterResults {
public:
    explicit FilterResults(Frame &frame) : frame_(frame) {}
    /// Removes every result that was not placed.
    ~FilterResults();
    FilterResults(const FilterResults &) = delete;
    FilterResults &operator=(const FilterResults &) = delete;

    /// Creates a tiled colour layer `name` that will replace `target` (which may be absent);
    /// null after one error message when the name is taken or the layer cannot be made. It
    /// may reuse a retired layer's storage: the filter must write every texel before placing.
    LayerT<Color> *addColor(const std::string &name, const std::string &target,
                            const char *filterName);
    /// True when `name` is free for a result; false after the error message addColor gives
    /// (for a filter that finds it can do without the layer).
    bool nameFree(const std::string &name, const char *filterName) const;
    /// Retires every source given (may repeat or be absent), then renames each result to
    /// its target. False after one error message when a rename fails.
    bool place(const std::vector<std::string> &sources);
    /// Deletes the results now.
    void discard();

private:
    struct Entry {
        std::string name, target;
    };
    Frame &frame_;
    std::vector<Entry> entries_;
};

template <typename F>
bool TexelRuns::run(int32_t y0, int32_t y1, BandScratch &scratch, F &&body) {
    const int32_t w = in_.width();
    if (direct_) {
        // Tile by tile, so that each tile's memory is walked in one stream.
        const int32_t tw = inGrid_.tileWidth, th = inGrid_.tileHeight;
        // Results go to a run buffer in the cache first, then to the tile with streamed stores.
        Color *runBuffer = out_ ? scratch.colorBuffer(size_t(tw)) : nullptr;
        for (int32_t ty = y0 / th; ty * th < y1; ++ty) {
            const int32_t ya = std::max(y0, ty * th), yb = std::min(y1, (ty + 1) * th);
            for (int32_t tx = 0; tx * tw < w; ++tx) {
                const int32_t x = tx * tw, n = std::min(tw, w - x);
                const Color *src = inGrid_.tile(uint32_t(tx), uint32_t(ty));
                Color *dst = out_ ? outGrid_.tile(uint32_t(tx), uint32_t(ty)) : nullptr;
                const float *depth = z_ ? zGrid_.tile(uint32_t(tx), uint32_t(ty)) : nullptr;
                for (int32_t y = ya; y < yb; ++y) {
                    const int64_t row = int64_t(y - ty * th) * tw;
                    body(x, y, n, src + row, runBuffer, depth ? depth + row : nullptr);
                    if (dst) streamColors(dst + row, runBuffer, n);
                }
            }
        }
        streamFence();
        return true;
    }
    const Region rows(0, y0, w, y1);
    const size_t n = size_t(rows.area());
    Color *colors = scratch.colorBuffer(n);
    float *depth = z_ ? scratch.floatBuffer(n) : nullptr;
    if (!in_.read(rows, colors) || (z_ && !z_->read(rows, depth))) return false;
    for (int32_t y = y0; y < y1; ++y) {
        const size_t row = size_t(y - y0) * size_t(w);
        body(0, y, w, colors + row, out_ ? colors + row : nullptr, depth ? depth + row : nullptr);
    }
    return !out_ || out_->paste(rows, colors);
}

template <typename Chosen, typename Rewrite>
void InPlaceTexels::run(int32_t y0, int32_t y1, BandScratch &scratch, Chosen &&chosen,
                        Rewrite &&rewrite) {
    y1 = std::min(y1, height_);
    if (y0 < 0 || y0 >= y1) return;
    // The originals of the rows are gathered in the thread's buffer, then packed into the log
    // past the cache (no other thread reads them before the run has ended).
    Color *const buffer = scratch.colorBuffer(size_t(y1 - y0) * size_t(width_));
    Color *keep = buffer;
    eachRun(y0, y1, [&](int32_t x, int32_t y, Color *c, int32_t n) {
        for (int32_t i = 0; i < n; ++i)
            if (chosen(x + i, y, c[i])) {
                *keep++ = c[i];
                rewrite(x + i, y, c[i]);
            }
    });
    const size_t count = size_t(keep - buffer);
    const size_t first = used_.fetch_add(count, std::memory_order_relaxed);
    for (size_t done = 0; done < count;) {
        const int32_t part = int32_t(std::min<size_t>(count - done, 1 << 20));
        streamColors(log_.as<Color>() + first + done, buffer + done, part);
        done += size_t(part);
    }
    streamFence();
    first_[size_t(y0)] = first;
    done_[size_t(y0)] = y1;
}

template <typename Chosen>
void InPlaceTexels::restore(Chosen &&chosen) {
    for (size_t y0 = 0; y0 < done_.size(); ++y0) {
        if (done_[y0] == 0) continue;
        const Color *kept = log_.as<Color>() + first_[y0];
        eachRun(int32_t(y0), done_[y0], [&](int32_t x, int32_t y, Color *c, int32_t n) {
            for (int32_t i = 0; i < n; ++i)
                if (chosen(x + i, y, c[i])) c[i] = *kept++;
        });
        done_[y0] = 0;
    }
}

// ---------------------------------------------------------------------------------------------
// Pixel filters

/// A filter that computes each texel from the same texel of its sources, run by a
/// PostFilterCommand: init, then every row (filterRows), then finish.
class PostFilter {
public:
    virtual ~PostFilter() = default;
    /// Finds the source layers and creates the result layers; false after one message.
    virtual bool init(Frame &frame, RenderContext &context) = 0;
    /// Filters texel (x, y). Simple filters implement this alone; it is then called row by row
    /// on one thread.
    virtual bool filterPixel(int32_t x, int32_t y) = 0;
    /// Filters rows [y0, y1) with the calling thread's scratch buffers; on failure sets failedX
    /// and failedY. The default calls filterPixel.
    virtual bool filterRows(int32_t y0, int32_t y1, BandScratch &scratch, int32_t &failedX,
                            int32_t &failedY);
    /// True when filterRows may run on several threads at once.
    virtual bool concurrentRows() const { return false; }
    /// Places the results (deletes the sources, renames the results); false after one message.
    virtual bool finish(Frame &frame) = 0;
    /// Removes the unfinished results after a failure or an abort; the sources stay.
    virtual void discard(Frame &frame) = 0;

protected:
    /// The width of the frame being filtered (set by the command after init).
    int32_t width_ = 0;

private:
    friend class PostFilterCommand;
};

/// Runs a pixel filter over the whole frame ("Post Filter").
class PostFilterCommand final : public FrameCommand {
public:
    /// Runs filter (owned) on threadCount threads when the filter allows it.
    explicit PostFilterCommand(std::unique_ptr<PostFilter> filter, int threadCount = 1)
        : FrameCommand("Post Filter"), filter_(std::move(filter)), threads_(threadCount) {}
    using FrameCommand::execute;
    bool execute(Frame &frame, RenderContext &context, RenderIOInterface &io) override;
    /// The filter run by this command.
    PostFilter &filter() { return *filter_; }

private:
    std::unique_ptr<PostFilter> filter_;
    int threads_;
};

/// Removes a background colour mixed into semi-transparent texels: where a > max(t, 0),
/// rgb' = (rgb - bg (1 - a)) / a; elsewhere the texel is copied. One result layer per source,
/// "temp" (then "temp1", "temp2", ...), unless the sources are rewritten in place.
class PremultiplyFilter final : public PostFilter {
public:
    PremultiplyFilter(std::vector<std::string> sources, float threshold, const Color &background)
        : sources_(std::move(sources)), threshold_(threshold), background_(background) {}
    bool init(Frame &frame, RenderContext &context) override;
    bool filterPixel(int32_t x, int32_t y) override;
    bool filterRows(int32_t y0, int32_t y1, BandScratch &scratch, int32_t &failedX,
                    int32_t &failedY) override;
    bool concurrentRows() const override { return true; }
    bool finish(Frame &frame) override;
    void discard(Frame &frame) override;

    /// The filter of one colour.
    static Color premultiply(const Color &c, float threshold, const Color &background) {
        // A negative threshold would let a = 0 through to the division.
        if (!(c.a > threshold && c.a > 0.0f)) return c;
        const float k = 1.0f - c.a, inv = 1.0f / c.a;
        return Color((c.r - background.r * k) * inv, (c.g - background.g * k) * inv,
                     (c.b - background.b * k) * inv, c.a);
    }

private:
    /// True for a texel that the filter changes (its alpha, which the filter keeps, decides).
    bool chosen(const Color &c) const { return c.a > threshold_ && c.a > 0.0f; }

    std::vector<std::string> sources_;
    float threshold_;
    Color background_;
    std::vector<LayerT<Color> *> in_, out_;
    std::vector<std::unique_ptr<TexelRuns>> runs_;
    std::unique_ptr<FilterResults> results_;
    // Sources rewritten in place (instead of out_), and single texels rewritten so.
    std::vector<std::unique_ptr<InPlaceTexels>> inPlace_;
    struct PixelUndo {
        size_t layer;
        int32_t x, y;
        Color original;
    };
    std::vector<PixelUndo> pixelUndo_;
};

/// Maps the covered texels ("Z" >= 0; every texel when the frame has no "Z") of one colour
/// layer linearly so that the range found in them becomes [0, 1]: rgb together when remapRGB,
/// alpha when remapAlpha. An empty or non-finite range leaves the texels unchanged.
class RangeRemapFilter final : public PostFilter {
public:
    RangeRemapFilter(std::string source, bool remapRGB, bool remapAlpha)
        : source_(std::move(source)), remapRGB_(remapRGB), remapAlpha_(remapAlpha) {}
    bool init(Frame &frame, RenderContext &context) override;
    bool filterPixel(int32_t x, int32_t y) override;
    bool filterRows(int32_t y0, int32_t y1, BandScratch &scratch, int32_t &failedX,
                    int32_t &failedY) override;
    bool concurrentRows() const override { return true; }
    bool finish(Frame &frame) override;
    void discard(Frame &frame) override;

    /// The scale and offset found by init: v' = (v + offset) * scale.
    float rgbScale() const { return rgbScale_; }
    float rgbOffset() const { return rgbOffset_; }
    float alphaScale() const { return alphaScale_; }
    float alphaOffset() const { return alphaOffset_; }

private:
    std::string source_;
    bool remapRGB_, remapAlpha_;
    float rgbScale_ = 1, rgbOffset_ = 0, alphaScale_ = 1, alphaOffset_ = 0;
    LayerT<Color> *in_ = nullptr, *out_ = nullptr;
    LayerT<float> *z_ = nullptr;
    std::unique_ptr<FilterResults> results_;
};

/// Folds the three basis layers of a radiosity normal map into two: the average colour
/// normalised by its largest r, g, b, and the largest r, g, b of each basis (alpha: the
/// average alpha). The results replace the two output layers; the three sources are removed.
class RNMAverageMaxFilter final : public PostFilter {
public:
    RNMAverageMaxFilter(std::vector<std::string> sources, std::vector<std::string> outputs)
        : sources_(std::move(sources)), outputs_(std::move(outputs)) {}
    bool init(Frame &frame, RenderContext &context) override;
    bool filterPixel(int32_t x, int32_t y) override;
    bool filterRows(int32_t y0, int32_t y1, BandScratch &scratch, int32_t &failedX,
                    int32_t &failedY) override;
    bool concurrentRows() const override { return true; }
    bool finish(Frame &frame) override;
    void discard(Frame &frame) override;

    /// The fold of one texel: out[0] the normalised average, out[1] the maxima.
    static void fold(const Color &c0, const Color &c1, const Color &c2, Color out[2]);

private:
    std::vector<std::string> sources_, outputs_;
    LayerT<Color> *in_[3] = {}, *out_[2] = {};
    std::unique_ptr<FilterResults> results_;
};

// ---------------------------------------------------------------------------------------------
// Frame filters

/// Fills background texels ("Z" < 0) from the nearest covered ones: a background texel takes
/// the brightest covered texel of the first square ring around it (radius 1 to size) that holds
/// one, the first found on ties (ring order: left column bottom to top, right column, top row
/// left to right, bottom row); with none within size it gets the background colour. Covered
/// texels are copied. ("Edge Dilation Filter")
class EdgeDilationFilter final : public FrameCommand {
public:
    EdgeDilationFilter(std::vector<std::string> sources, int32_t size, const Color &background)
        : FrameCommand("Edge Dilation Filter"),
          sources_(std::move(sources)),
          size_(size),
          background_(background) {}
    /// Rows run on this many threads (the run's render threads).
    void setThreadCount(int threads) { threads_ = threads; }
    using FrameCommand::execute;
    bool execute(Frame &frame, RenderContext &context, RenderIOInterface &io) override;
    /// The same without a render context (the filter needs none).
    bool run(Frame &frame, RenderIOInterface *io);

private:
    std::vector<std::string> sources_;
    int32_t size_;
    Color background_;
    int threads_ = 1;
};

/// The minimum and maximum of one component (a channel, or r, g, b linked).
struct ComponentMinMax {
    float minVal = 3.4028235e38f;
    float maxVal = -3.4028235e38f;
    /// False when the texels were left unchanged (no texels, or an empty range).
    bool remapped = false;
};

/// The ranges one instance's texels covered.
struct ShapeMinMax {
    std::string shape;
    std::vector<ComponentMinMax> components;
};

/// What a shape normalization found and applied: the image-wide ranges and one entry per
/// instance that had texels. Components are r, g, b[, a] (per channel) or rgb[, a] (linked).
struct MinMaxData {
    std::vector<ComponentMinMax> image;
    std::vector<ShapeMinMax> shapes;
};

/// Writes the record as XML (root "MinMaxRoot") through a temporary name; false after one
/// error message, an existing file then stays as it was.
bool writeMinMaxData(const std::string &fileName, const MinMaxData &data);
/// Reads a record written by writeMinMaxData; false after one error message.
bool readMinMaxData(const std::string &fileName, MinMaxData &data);

/// Tells which instance each texel of a light map belongs to (the bake run samples the
/// surface at the texel centre).
class TexelInstanceInterface {
public:
    virtual ~TexelInstanceInterface() = default;
    /// Fills ids[0 .. width) with the instance index (0 .. instanceCount() - 1) of the texels of
    /// row y, or -1 for a texel without one. Called concurrently for different rows.
    virtual void instancesOfRow(int32_t y, int32_t width, int32_t *ids) const = 0;
    /// The number of instances.
    virtual int32_t instanceCount() const = 0;
    /// The name of instance i.
    virtual std::string instanceName(int32_t i) const = 0;
};

/// The settings of a shape normalization (the bake's "Normalize" settings).
struct NormalizeOptions {
    /// Max: [0, max] -> [0, 1]; MinMax: [min, max] -> [0, 1].
    NormalizeRange range = NormalizeRange::Max;
    /// PerChannel, or Linked: r, g and b share one range (alpha keeps its own).
    NormalizeOutput output = NormalizeOutput::PerChannel;
    /// Shape: one range per instance; Image: one range over the image.
    NormalizeComponent component = NormalizeComponent::Shape;
    /// Alpha is normalized too.
    bool alpha = false;
};

/// Compresses the dynamic range of a colour layer: the covered texels' values are mapped so
/// that the range found per instance (or over the image) becomes [0, 1]. Texels without an
/// instance and background texels stay as they are. ("Shape Normalization Filter")
class ShapeNormalizationFilter final : public FrameCommand {
public:
    /// instances (not owned, may be null in Image mode: every covered texel counts then).
    ShapeNormalizationFilter(std::string source, const NormalizeOptions &options,
                             const TexelInstanceInterface *instances)
        : FrameCommand("Shape Normalization Filter"),
          source_(std::move(source)),
          options_(options),
          instances_(instances) {}
    /// Rows run on this many threads.
    void setThreadCount(int threads) { threads_ = threads; }
    /// Writes the record to this file after a successful run (empty: not written).
    void setRecordFile(std::string fileName) { recordFile_ = std::move(fileName); }
    using FrameCommand::execute;
    bool execute(Frame &frame, RenderContext &context, RenderIOInterface &io) override;
    /// The same without a render context.
    bool run(Frame &frame, RenderIOInterface *io);
    /// The record of the last run.
    const MinMaxData &record() const { return record_; }

private:
    std::string source_;
    NormalizeOptions options_;
    const TexelInstanceInterface *instances_;
    int threads_ = 1;
    std::string recordFile_;
    MinMaxData record_;
};

/// An output shader: changes a finished colour layer in place before it is written.
class OutputShaderInterface {
public:
    virtual ~OutputShaderInterface() = default;
    /// Shades the layer; false after one message.
    virtual bool shade(LayerT<Color> &layer, RenderIOInterface &io) = 0;
};

/// Runs the run's output shaders, in order, over the target layer ("Output Shader").
class OutputShaderCommand final : public FrameCommand {
public:
    /// shaders are not owned and must outlive the command.
    OutputShaderCommand(std::string target, std::vector<OutputShaderInterface *> shaders)
        : FrameCommand("Output Shader"), target_(std::move(target)), shaders_(std::move(shaders)) {}
    using FrameCommand::execute;
    bool execute(Frame &frame, RenderContext &context, RenderIOInterface &io) override;

private:
    std::string target_;
    std::vector<OutputShaderInterface *> shaders_;
};

}  // namespace ox
