#include <algorithm>
#include <cmath>
#include <functional>
#include <optional>
#include <type_traits>
#ifdef __SSE2__
#include <emmintrin.h>
#endif
#include <vector>

#include "core/message.h"
#include "render/frame.h"
#include "render/post_filter.h"

namespace ox {

namespace {

/// Texels without an instance that are named in the debug log; the rest are counted.
constexpr size_t kMaxLoggedTexels = 100;

/// Running minimum and maximum of one component.
struct Range {
    float lo = 3.4028235e38f, hi = -3.4028235e38f;
    void add(float v) {
        // Infinite or NaN values would spoil the range of every other texel.
        if (std::isfinite(v)) lo = std::min(lo, v), hi = std::max(hi, v);
    }
    void merge(const Range &o) { lo = std::min(lo, o.lo), hi = std::max(hi, o.hi); }
};

/// The finite ranges of r, g, b and a of one slot.
struct alignas(16) ChannelRanges {
    float lo[4] = {3.4028235e38f, 3.4028235e38f, 3.4028235e38f, 3.4028235e38f};
    float hi[4] = {-3.4028235e38f, -3.4028235e38f, -3.4028235e38f, -3.4028235e38f};
    void merge(const ChannelRanges &o) {
        for (int c = 0; c < 4; ++c)
            lo[c] = std::min(lo[c], o.lo[c]), hi[c] = std::max(hi[c], o.hi[c]);
    }
};

/// The ranges of a run of texels of one slot, kept in registers and merged into the slot's
/// ChannelRanges at the end of the run. Infinite and NaN values are left out (they would
/// spoil the range of every other texel); -0 counts as +0, so that the minimum of a zero
/// does not depend on the order in which the threads' ranges merge.
class RunRanges {
public:
    RunRanges() { reset(); }
#ifdef __SSE2__
    void reset() {
        lo_ = _mm_set1_ps(3.4028235e38f);
        hi_ = _mm_set1_ps(-3.4028235e38f);
    }
    void add(const Color &c) {
        const __m128 v = _mm_add_ps(_mm_loadu_ps(&c.r), _mm_setzero_ps());
        const __m128 finite = _mm_cmpeq_ps(_mm_sub_ps(v, v), _mm_setzero_ps());
        lo_ = _mm_min_ps(_mm_or_ps(_mm_and_ps(finite, v), _mm_andnot_ps(finite, kHuge())), lo_);
        hi_ = _mm_max_ps(_mm_or_ps(_mm_and_ps(finite, v), _mm_andnot_ps(finite, kLow())), hi_);
    }
    void mergeInto(ChannelRanges &r) const {
        _mm_store_ps(r.lo, _mm_min_ps(lo_, _mm_load_ps(r.lo)));
        _mm_store_ps(r.hi, _mm_max_ps(hi_, _mm_load_ps(r.hi)));
    }

private:
    static __m128 kHuge() { return _mm_set1_ps(3.4028235e38f); }
    static __m128 kLow() { return _mm_set1_ps(-3.4028235e38f); }
    __m128 lo_, hi_;
#else
    void reset() { r_ = ChannelRanges(); }
    void add(const Color &c) {
        const float v[4] = {c.r + 0.0f, c.g + 0.0f, c.b + 0.0f, c.a + 0.0f};
        for (int k = 0; k < 4; ++k)
            if (std::isfinite(v[k]))
                r_.lo[k] = std::min(r_.lo[k], v[k]), r_.hi[k] = std::max(r_.hi[k], v[k]);
    }
    void mergeInto(ChannelRanges &r) const { r.merge(r_); }

private:
    ChannelRanges r_;
#endif
};

/// v' = (v + offset) * scale for one channel.
struct Remap {
    float scale = 1.0f, offset = 0.0f;
};

/// The remaps of r, g, b and a of one slot.
struct alignas(16) SlotRemap {
    float offset[4] = {0, 0, 0, 0};
    float scale[4] = {1, 1, 1, 1};

    /// (c + offset) * scale, channel by channel.
    Color apply(const Color &c) const {
#ifdef __SSE2__
        Color out;
        _mm_storeu_ps(&out.r, _mm_mul_ps(_mm_add_ps(_mm_loadu_ps(&c.r), _mm_load_ps(offset)),
                                         _mm_load_ps(scale)));
        return out;
#else
        return Color((c.r + offset[0]) * scale[0], (c.g + offset[1]) * scale[1],
                     (c.b + offset[2]) * scale[2], (c.a + offset[3]) * scale[3]);
#endif
    }
};

/// The remap of a range under the range mode; false (identity) when it cannot be applied.
bool remapOf(const Range &r, NormalizeRange mode, Remap &out) {
    out = Remap();
    if (r.lo > r.hi) return false;
    const float lo = mode == NormalizeRange::MinMax ? r.lo : 0.0f;
    const float span = r.hi - lo;
    if (!(span > 0.0f) || !std::isfinite(span) || !std::isfinite(1.0f / span)) return false;
    out.scale = 1.0f / span;
    out.offset = -lo;
    return true;
}

}  // namespace

bool ShapeNormalizationFilter::execute(Frame &frame, RenderContext &, RenderIOInterface &io) {
    return run(frame, &io);
}

bool ShapeNormalizationFilter::run(Frame &frame, RenderIOInterface *io) {
    record_ = MinMaxData();
    LayerT<Color> *in = frame.getColorLayer(source_);
    if (!in) {
        message(kMsgError, 6, "Source layer %s not found in shape normalization filter",
                source_.c_str());
        return false;
    }
    const bool perShape = options_.component == NormalizeComponent::Shape;
    if (perShape && !instances_) {
        message(kMsgError, 6,
                "Shape normalization of %s per shape needs the instances of the texels",
                source_.c_str());
        return false;
    }
    LayerT<float> *z = frame.getFloatLayer("Z");
    const int32_t w = frame.width(), h = frame.height();

    // Components: r, g, b[, a] per channel, or rgb[, a] linked; channel c uses component
    // channelComp[c] (-1: left alone).
    const bool linked = options_.output == NormalizeOutput::Linked;
    const int32_t rgbComps = linked ? 1 : 3;
    const int32_t comps = rgbComps + (options_.alpha ? 1 : 0);
    const int32_t channelComp[4] = {0, linked ? 0 : 1, linked ? 0 : 2,
                                    options_.alpha ? rgbComps : -1};
    // Slot i < count: instance i; slot count: texels counted without a lookup.
    const int32_t count = instances_ ? std::max(0, instances_->instanceCount()) : 0;
    const int32_t slots = count + 1;

    // The remapped texels are rewritten in the source's tiles when it allows (their originals
    // kept until the end), else the result goes to "temp" and replaces the source.
    const int32_t bandRows = kFilterBandRows;
    std::optional<InPlaceTexels> rewrite;
    if (InPlaceTexels::possible(*in)) {
        rewrite.emplace(*in, frame.scratch());
        // Without room for the originals the result goes to "temp" after all.
        if (!rewrite->ok()) rewrite.reset();
    }
    const bool inPlace = rewrite.has_value();
    FilterResults results(frame);
    LayerT<Color> *out = nullptr;
    if (inPlace ? !results.nameFree("temp", "shape normalization filter")
                : !(out = results.addColor("temp", source_, "shape normalization filter")))
        return false;

    // Gather: per thread ranges, the instance of every texel, texels without one per band.
    const int32_t bandCount = (h + bandRows - 1) / bandRows;
    // The slot of every texel, in 16 bits when the slots allow (most runs): the table is
    // written once and read once, so its size is memory traffic.
    const bool compact = slots < 0xfffe;
    ScratchBlock idBlock = frame.scratch().borrow(size_t(w) * size_t(h) *
                                                  (compact ? sizeof(uint16_t) : sizeof(int32_t)));
    void *const idTable = idBlock.as<void>();
    if (!idTable) {
        message(kMsgError, 6, "Shape normalization of %s is out of memory", source_.c_str());
        return false;
    }
    const int threads = std::max(threads_, 1);
    std::vector<std::vector<ChannelRanges>> ranges(
        size_t(threads), std::vector<ChannelRanges>(static_cast<size_t>(slots)));
    std::vector<int64_t> orphanCounts(size_t(bandCount), 0);
    std::vector<BandScratch> scratch;
    for (int t = 0; t < threads; ++t) scratch.emplace_back(frame.scratch());
    std::vector<ScratchBlock> lookups(static_cast<size_t>(threads));
    // Background texels get the id Id(-1), texels without an instance Id(-2).
    std::optional<TexelRuns> gatherRuns(std::in_place, *in, nullptr, z);
    auto gatherBand = [&](auto *ids, int32_t y0, int32_t y1, int thread) {
        using Id = std::remove_pointer_t<decltype(ids)>;
        constexpr Id kBackground = Id(-1), kOrphan = Id(-2);
        int32_t *const looked = scratchArray<int32_t>(frame.scratch(), lookups[size_t(thread)],
                                                      size_t(w) * size_t(y1 - y0));
        for (int32_t y = y0; y < y1; ++y) {
            int32_t *id = looked + size_t(y - y0) * size_t(w);
            if (instances_)
                instances_->instancesOfRow(y, w, id);
            else
                std::fill(id, id + w, count);
        }
        ChannelRanges *const acc = ranges[size_t(thread)].data();
        int64_t orphansHere = 0;
        const bool read = gatherRuns->run(
            y0, y1, scratch[size_t(thread)],
            [&](int32_t x0, int32_t y, int32_t n, const Color *src, Color *, const float *depth) {
                const int32_t *found = looked + size_t(y - y0) * size_t(w) + size_t(x0);
                Id *id = ids + size_t(y) * size_t(w) + size_t(x0);
                // Neighbours mostly share their instance: its ranges stay in registers.
                RunRanges run;
                int32_t current = -1;
                for (int32_t i = 0; i < n; ++i) {
                    if (depth && !(depth[i] >= 0.0f)) {
                        id[i] = kBackground;
                        continue;
                    }
                    const int32_t slot = found[i];
                    if (instances_ && (slot < 0 || slot >= count)) {
                        id[i] = kOrphan;
                        ++orphansHere;
                        continue;
                    }
                    id[i] = Id(slot);
                    if (slot != current) {
                        if (current >= 0) run.mergeInto(acc[current]);
                        current = slot;
                        run.reset();
                    }
                    run.add(src[i]);
                }
                if (current >= 0) run.mergeInto(acc[current]);
            });
        orphanCounts[size_t(y0 / bandRows)] = orphansHere;
        return read;
    };
    RowBands gather(h, bandRows, threads, nullptr);
    const bool gathered = gather.run([&](int32_t y0, int32_t y1, int thread) {
        const bool read = compact ? gatherBand(static_cast<uint16_t *>(idTable), y0, y1, thread)
                                  : gatherBand(static_cast<int32_t *>(idTable), y0, y1, thread);
        if (!read) {
            message(kMsgError, 6, "Shape normalization could not read layer %s", source_.c_str());
            return false;
        }
        return true;
    });
    gatherRuns.reset();
    if (!gathered) return false;

    // The texels without an instance, in row order whatever the thread count.
    auto isOrphan = [&](size_t i) {
        return compact ? static_cast<const uint16_t *>(idTable)[i] == uint16_t(-2)
                       : static_cast<const int32_t *>(idTable)[i] == -2;
    };
    size_t logged = 0;
    int64_t orphanTotal = 0;
    for (int32_t b = 0; b < bandCount; ++b) {
        orphanTotal += orphanCounts[size_t(b)];
        if (orphanCounts[size_t(b)] == 0 || logged >= kMaxLoggedTexels) continue;
        for (int32_t y = b * bandRows; y < std::min(h, (b + 1) * bandRows); ++y)
            for (int32_t x = 0; x < w && logged < kMaxLoggedTexels; ++x)
                if (isOrphan(size_t(y) * size_t(w) + size_t(x))) {
                    message(kMsgDebug, 6, "No instance found in sampled pixel %d, %d", x, y);
                    ++logged;
                }
    }
    if (orphanTotal > int64_t(logged))
        message(kMsgDebug, 6, "No instance found in %lld more sampled pixels",
                static_cast<long long>(orphanTotal - int64_t(logged)));

    // Merge the threads' ranges (minimum and maximum do not depend on the order).
    std::vector<ChannelRanges> channels(static_cast<size_t>(slots));
    for (const auto &acc : ranges)
        for (size_t i = 0; i < channels.size(); ++i) channels[i].merge(acc[i]);
    std::vector<Range> total(size_t(slots) * size_t(comps));
    for (int32_t s = 0; s < slots; ++s)
        for (int ch = 0; ch < 4; ++ch)
            if (channelComp[ch] >= 0)
                total[size_t(s) * size_t(comps) + size_t(channelComp[ch])].merge(
                    {channels[size_t(s)].lo[ch], channels[size_t(s)].hi[ch]});
    std::vector<Range> image(static_cast<size_t>(comps));
    for (int32_t s = 0; s < slots; ++s)
        for (int32_t c = 0; c < comps; ++c)
            image[size_t(c)].merge(total[size_t(s) * size_t(comps) + size_t(c)]);

    // The remap of every slot and channel, and the record.
    std::vector<SlotRemap> remaps(static_cast<size_t>(slots));
    std::vector<Remap> imageRemap(static_cast<size_t>(comps));
    std::vector<bool> imageApplied(static_cast<size_t>(comps));
    for (int32_t c = 0; c < comps; ++c)
        imageApplied[size_t(c)] = remapOf(image[size_t(c)], options_.range, imageRemap[size_t(c)]);
    record_.image.resize(size_t(comps));
    for (int32_t c = 0; c < comps; ++c) {
        ComponentMinMax &e = record_.image[size_t(c)];
        e.minVal = image[size_t(c)].lo;
        e.maxVal = image[size_t(c)].hi;
        e.remapped = !perShape && imageApplied[size_t(c)];
    }
    for (int32_t s = 0; s < slots; ++s) {
        const Range *r = total.data() + size_t(s) * size_t(comps);
        std::vector<Remap> own(static_cast<size_t>(comps));
        std::vector<bool> applied(static_cast<size_t>(comps));
        for (int32_t c = 0; c < comps; ++c)
            applied[size_t(c)] = remapOf(r[c], options_.range, own[size_t(c)]);
        for (int ch = 0; ch < 4; ++ch) {
            const int32_t c = channelComp[ch];
            if (c < 0) continue;
            const Remap &m = perShape ? own[size_t(c)] : imageRemap[size_t(c)];
            remaps[size_t(s)].offset[ch] = m.offset;
            remaps[size_t(s)].scale[ch] = m.scale;
        }
        if (s < count && r[0].lo <= r[0].hi) {
            ShapeMinMax shape;
            shape.shape = instances_->instanceName(s);
            for (int32_t c = 0; c < comps; ++c)
                shape.components.push_back(
                    {r[c].lo, r[c].hi, perShape && bool(applied[size_t(c)])});
            record_.shapes.push_back(std::move(shape));
        }
    }

    // Remap the covered texels that have an instance; the rest stay (or are copied).
    // Background Id(-1) and no instance Id(-2) are the two largest codes of the unsigned table,
    // the two negative ones of the signed one.
    auto hasSlot = [](auto id) {
        if constexpr (std::is_signed_v<decltype(id)>)
            return id >= 0;
        else
            return id < decltype(id)(-2);
    };
    // Until the end, whatever way the run ends, rewritten texels go back.
    auto restore = [&](const auto *ids) {
        rewrite->restore([&](int32_t x, int32_t y, const Color &) {
            return hasSlot(ids[size_t(y) * size_t(w) + size_t(x)]);
        });
    };
    struct Undo {
        std::function<void()> undo;
        ~Undo() {
            if (undo) undo();
        }
    } undo;
    if (inPlace)
        undo.undo = [&] {
            if (compact)
                restore(static_cast<const uint16_t *>(idTable));
            else
                restore(static_cast<const int32_t *>(idTable));
        };

    std::optional<TexelRuns> remapRuns;
    if (!inPlace) remapRuns.emplace(*in, out, nullptr);
    RowBands remap(h, bandRows, threads, io);
    auto remapBand = [&](const auto *ids, int32_t y0, int32_t y1, int thread) {
        if (inPlace) {
            rewrite->run(
                y0, y1, scratch[size_t(thread)],
                [&](int32_t x, int32_t y, const Color &) {
                    return hasSlot(ids[size_t(y) * size_t(w) + size_t(x)]);
                },
                [&](int32_t x, int32_t y, Color &c) {
                    c = remaps[size_t(ids[size_t(y) * size_t(w) + size_t(x)])].apply(c);
                });
            return true;
        }
        return remapRuns->run(
            y0, y1, scratch[size_t(thread)],
            [&](int32_t x0, int32_t y, int32_t n, const Color *src, Color *dst, const float *) {
                const auto *id = ids + size_t(y) * size_t(w) + size_t(x0);
                for (int32_t i = 0; i < n; ++i)
                    dst[i] = hasSlot(id[i]) ? remaps[size_t(id[i])].apply(src[i]) : src[i];
            });
    };
    const bool ok = remap.run([&](int32_t y0, int32_t y1, int thread) {
        const bool done = compact
                              ? remapBand(static_cast<const uint16_t *>(idTable), y0, y1, thread)
                              : remapBand(static_cast<const int32_t *>(idTable), y0, y1, thread);
        if (!done) {
            message(kMsgError, 6, "Shape normalization could not remap layer %s", source_.c_str());
            return false;
        }
        return true;
    });
    if (!ok) {
        if (remap.aborted()) message(kMsgProgress, 6, "Shape normalization aborted");
        return false;
    }
    if (!recordFile_.empty() && !writeMinMaxData(recordFile_, record_)) return false;
    if (inPlace) {
        undo.undo = nullptr;  // the rewritten source is the result
        return true;
    }
    return results.place({source_});
}

}  // namespace ox
