#pragma once

#include <algorithm>
#include <cstdint>
#include <deque>
#include <memory>
#include <vector>

#include "core/check.h"
#include "render/layer.h"

/// Per-reader caches over a layer for code that visits pixels one by one (post filters, bake
/// filters): 64 x 64 slots loaded on first touch, kept up to a bound, written back when
/// evicted, flushed or destroyed. One cache belongs to one thread.
namespace ox {

/// What a layer cache does with the layer.
enum class LayerCacheMode : int32_t {
    kRead = 0,       ///< slots are loaded from the layer and never written back
    kWrite = 1,      ///< slots start at zero and are written back whole: for layers that are
                     ///< being filled from scratch (untouched pixels of a touched slot become 0)
    kReadWrite = 2,  ///< slots are loaded from the layer and written back
};

namespace detail {

/// The slot machinery shared by the typed and the custom-float caches: `units` values of V per
/// pixel over a layer with typed read and paste.
template <typename V, typename L, LayerCacheMode M>
class LayerSlotCache {
public:
    static constexpr int32_t kSlotShift = 6;
    static constexpr int32_t kSlotSize = 1 << kSlotShift;

    LayerSlotCache(L &layer, int32_t units, size_t maxSlots)
        : layer_(layer),
          units_(units),
          maxSlots_(maxSlots < 1 ? 1 : maxSlots),
          nx_((int64_t(layer.width()) + kSlotSize - 1) >> kSlotShift),
          ny_((int64_t(layer.height()) + kSlotSize - 1) >> kSlotShift),
          slots_(size_t(nx_ * ny_)) {}
    ~LayerSlotCache() { flush(); }
    LayerSlotCache(const LayerSlotCache &) = delete;
    LayerSlotCache &operator=(const LayerSlotCache &) = delete;

    /// The first of the `units` values of pixel (x, y), which must lie inside the layer. The
    /// pointer is valid until the next call.
    V *pixel(int32_t x, int32_t y) {
        OX_CHECK(x >= 0 && y >= 0 && x < layer_.width() && y < layer_.height());
        const int64_t s = int64_t(y >> kSlotShift) * nx_ + (x >> kSlotShift);
        std::unique_ptr<V[]> &slot = slots_[size_t(s)];
        if (!slot) load(s);
        const int64_t i = (int64_t(y & (kSlotSize - 1)) << kSlotShift) + (x & (kSlotSize - 1));
        return slot.get() + i * units_;
    }

    /// Writes every loaded slot back (write modes); false when the layer refused a slot.
    bool flush() {
        bool ok = ok_;
        if constexpr (M != LayerCacheMode::kRead)
            for (int64_t s : loaded_) ok = store(s) && ok;
        return ok;
    }
    /// False when a slot could not be read or written.
    bool ok() const { return ok_; }
    /// Slots currently loaded.
    size_t loadedSlots() const { return loaded_.size(); }

private:
    Region slotRegion(int64_t s) const {
        const int32_t x0 = int32_t((s % nx_) << kSlotShift), y0 = int32_t((s / nx_) << kSlotShift);
        return Region(x0, y0, std::min(x0 + kSlotSize, layer_.width()),
                      std::min(y0 + kSlotSize, layer_.height()));
    }
    void load(int64_t s) {
        if (loaded_.size() >= maxSlots_) {
            const int64_t old = loaded_.front();
            loaded_.pop_front();
            if constexpr (M != LayerCacheMode::kRead) ok_ = store(old) && ok_;
            slots_[size_t(old)].reset();
        }
        std::unique_ptr<V[]> &slot = slots_[size_t(s)];
        slot.reset(new V[size_t(kSlotSize) * kSlotSize * size_t(units_)]());
        if constexpr (M != LayerCacheMode::kWrite)
            ok_ = layer_.read(slotRegion(s), slot.get(), kSlotSize) && ok_;
        loaded_.push_back(s);
    }
    bool store(int64_t s) {
        return layer_.paste(slotRegion(s), slots_[size_t(s)].get(), kSlotSize);
    }

    L &layer_;
    int32_t units_;
    size_t maxSlots_;
    int64_t nx_, ny_;
    std::vector<std::unique_ptr<V[]>> slots_;
    std::deque<int64_t> loaded_;
    bool ok_ = true;
};

}  // namespace detail

/// The default bound on loaded slots of a layer cache (1024 slots of 64 x 64 pixels).
constexpr size_t kLayerCacheSlots = 1024;

/// A cache over a float or colour layer (T = float or Color).
template <typename T, LayerCacheMode M>
class LayerCacheGCT {
public:
    /// A cache over layer (which must outlive it) keeping at most maxSlots slots loaded.
    explicit LayerCacheGCT(LayerT<T> &layer, size_t maxSlots = kLayerCacheSlots)
        : cache_(layer, 1, maxSlots) {}
    /// Pixel (x, y), read-only.
    const T &get(int32_t x, int32_t y) { return *cache_.pixel(x, y); }
    /// Pixel (x, y) for writing (write modes only); valid until the next access.
    T &at(int32_t x, int32_t y) {
        static_assert(M != LayerCacheMode::kRead, "a read cache does not write");
        return *cache_.pixel(x, y);
    }
    /// Sets pixel (x, y).
    void set(int32_t x, int32_t y, const T &value) { at(x, y) = value; }
    /// Writes every loaded slot back now; false when the layer refused one.
    bool flush() { return cache_.flush(); }
    /// False when a slot could not be read or written.
    bool ok() const { return cache_.ok(); }

private:
    detail::LayerSlotCache<T, LayerT<T>, M> cache_;
};

/// A cache over a custom-float layer: pixel access gives the N floats of a pixel.
template <LayerCacheMode M>
class LayerCacheGCCFT {
public:
    /// A cache over layer (which must outlive it) keeping at most maxSlots slots loaded.
    explicit LayerCacheGCCFT(CustomFloatLayer &layer, size_t maxSlots = kLayerCacheSlots)
        : cache_(layer, layer.channels(), maxSlots) {}
    /// The channels of pixel (x, y), read-only; valid until the next access.
    const float *get(int32_t x, int32_t y) { return cache_.pixel(x, y); }
    /// The channels of pixel (x, y) for writing (write modes only).
    float *at(int32_t x, int32_t y) {
        static_assert(M != LayerCacheMode::kRead, "a read cache does not write");
        return cache_.pixel(x, y);
    }
    /// Writes every loaded slot back now.
    bool flush() { return cache_.flush(); }
    /// False when a slot could not be read or written.
    bool ok() const { return cache_.ok(); }

private:
    detail::LayerSlotCache<float, CustomFloatLayer, M> cache_;
};

}  // namespace ox
