#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "core/types.h"
#include "render/layer.h"
#include "render/layer_tiled.h"

/// The frame: a set of named layers of one size that renders and bakes fill, filters
/// transform and writers store.
namespace ox {

class ScratchPool;

/// A block of memory borrowed from a ScratchPool (contents undefined until written); it goes
/// back to its pool when destroyed.
class ScratchBlock {
public:
    ScratchBlock() = default;
    ~ScratchBlock() { reset(); }
    ScratchBlock(ScratchBlock &&o) noexcept { *this = std::move(o); }
    ScratchBlock &operator=(ScratchBlock &&o) noexcept;
    ScratchBlock(const ScratchBlock &) = delete;
    ScratchBlock &operator=(const ScratchBlock &) = delete;

    /// The block as an array of T (64-byte aligned); null when empty.
    template <typename T>
    T *as() const {
        return static_cast<T *>(data_);
    }
    /// The size in bytes.
    size_t bytes() const { return bytes_; }
    /// Gives the block back now.
    void reset();

private:
    friend class ScratchPool;
    ScratchPool *pool_ = nullptr;
    void *data_ = nullptr;
    size_t bytes_ = 0;
};

/// Memory that the commands working on a frame borrow and give back, so that one filter after
/// another (and one pass after another) reuses pages instead of faulting in and zero-filling
/// fresh ones. Thread-safe. Blocks borrowed must be given back before the pool is destroyed.
class ScratchPool {
public:
    ScratchPool() = default;
    ~ScratchPool() { release(); }
    ScratchPool(const ScratchPool &) = delete;
    ScratchPool &operator=(const ScratchPool &) = delete;

    /// A block of at least `bytes` bytes; empty (as<T>() null) when the memory cannot be had.
    ScratchBlock borrow(size_t bytes);
    /// Frees the blocks kept for reuse.
    void release();
    /// The bytes kept for reuse.
    size_t keptBytes() const;
    /// The most blocks kept for reuse.
    static constexpr size_t kKeptBlocks = 32;

private:
    friend class ScratchBlock;
    struct Kept {
        void *data;
        size_t bytes;
    };
    void giveBack(void *data, size_t bytes);

    mutable std::mutex mutex_;
    std::vector<Kept> kept_;
};

/// A set of named layers of equal size, ordered by name (bytewise). The frame owns its layers
/// until they are detached. The layer map itself is not locked: add, delete, detach and
/// rename layers only while no thread pastes or reads.
class Frame {
public:
    /// An empty frame of width x height pixels.
    Frame(int32_t width, int32_t height) : width_(width), height_(height) {}
    ~Frame() = default;
    Frame(const Frame &) = delete;
    Frame &operator=(const Frame &) = delete;

    int32_t width() const { return width_; }
    int32_t height() const { return height_; }

    /// Takes ownership of a layer. Refused (false, one message; the layer is destroyed) when
    /// a layer of that name exists, when its size differs from the frame's, or when it has no
    /// storage.
    bool addLayer(std::unique_ptr<Layer> layer);
    /// Creates and adds a tiled boolean, float or colour layer; null when refused.
    template <typename T>
    LayerT<T> *addTiledLayer(const std::string &name, int32_t tileSize = kLayerTileSize);
    /// Adds a tiled colour layer (default tiles) for a result that its maker writes whole
    /// before anything reads it: it takes over the storage of a layer retired before when the
    /// frame keeps one (its pixels are then undefined until written), else it is a new
    /// zero-filled layer. Null when refused. Reusing storage spares the page faults and the
    /// zero filling of a fresh block, which cost more than the filters themselves.
    LayerT<Color> *addScratchColorLayer(const std::string &name);
    /// Creates and adds a linear custom-float layer of `channels` floats per pixel; null
    /// when refused.
    CustomFloatLayer *addCustomFloatLayer(const std::string &name, int32_t channels);

    /// The layer of that name, or null.
    Layer *getLayer(const std::string &name) const;
    /// The layer of that name when it is a boolean layer, else null.
    LayerT<bool> *getBoolLayer(const std::string &name) const;
    /// The layer of that name when it is a float layer, else null.
    LayerT<float> *getFloatLayer(const std::string &name) const;
    /// The layer of that name when it is a colour layer, else null.
    LayerT<Color> *getColorLayer(const std::string &name) const;
    /// The layer of that name when it is a custom-float layer, else null.
    CustomFloatLayer *getCFLayer(const std::string &name) const;
    /// True when a layer of that name exists.
    bool hasLayer(const std::string &name) const { return layers_.count(name) != 0; }
    /// The layer names in order.
    std::vector<std::string> layerNames() const;
    /// The layers in name order.
    const std::map<std::string, std::unique_ptr<Layer>> &layers() const { return layers_; }

    /// Pastes into the boolean, float or colour layer of that name (T = bool, float, Color).
    /// False with one message when the layer is missing, of another kind, or refuses.
    template <typename T>
    bool pasteRegion(const std::string &name, const Region &region, const T *data,
                     int64_t stride = -1);
    /// Reads from the boolean, float or colour layer of that name; as pasteRegion.
    template <typename T>
    bool readRegion(const std::string &name, const Region &region, T *data, int64_t stride = -1);
    /// Pastes into the custom-float layer of that name (stride in pixels).
    bool pasteCFRegion(const std::string &name, const Region &region, const float *data,
                       int64_t stride = -1);
    /// Reads from the custom-float layer of that name (stride in pixels).
    bool readCFRegion(const std::string &name, const Region &region, float *data,
                      int64_t stride = -1);

    /// Removes and destroys a layer (its observer registrations go with it).
    bool deleteLayer(const std::string &name);
    /// Removes a layer like deleteLayer, but keeps the storage of a tiled colour layer with
    /// default tiles for the next addScratchColorLayer (at most kRetiredLayers are kept; an
    /// older one is destroyed). Its observer registrations go.
    bool retireLayer(const std::string &name);
    /// Destroys the kept storage of retired layers.
    void releaseRetiredLayers() { retired_.clear(); }
    /// The number of retired layers kept.
    size_t retiredLayerCount() const { return retired_.size(); }
    /// The most retired layers a frame keeps.
    static constexpr size_t kRetiredLayers = 1;
    /// The scratch memory of commands working on this frame.
    ScratchPool &scratch() { return scratch_; }
    /// Removes a layer without destroying it; the caller owns the result (null when absent).
    std::unique_ptr<Layer> detachLayer(const std::string &name);
    /// Calls the layer's synchronize.
    bool flushLayer(const std::string &name);
    /// Gives a layer a new name; refused when `from` is missing or `to` exists (unless equal).
    bool renameLayer(const std::string &from, const std::string &to);

    /// Registers an observer on a layer (false when the layer is missing).
    bool registerObserver(const std::string &name, LayerObserver *observer);
    /// Unregisters an observer from a layer (false when the layer is missing).
    bool unregisterObserver(const std::string &name, LayerObserver *observer);

private:
    Layer *typedLayer(const std::string &name, LayerKind kind, bool paste) const;

    int32_t width_, height_;
    std::map<std::string, std::unique_ptr<Layer>> layers_;
    std::vector<std::unique_ptr<Layer>> retired_;  // oldest first
    ScratchPool scratch_;
};

/// Frame utilities.
class FrameUtils {
public:
    /// A new frame of the region's size holding a copy of each named layer's region (tiled
    /// 64 x 64 for boolean, float and colour layers, linear for custom-float ones). Null
    /// after one message when a layer is missing or a copy fails.
    static std::unique_ptr<Frame> crop(Frame &frame, const Region &region,
                                       const std::vector<std::string> &layerNames);
};

// ---------------------------------------------------------------------------------------------

template <typename T>
LayerT<T> *Frame::addTiledLayer(const std::string &name, int32_t tileSize) {
    auto layer = std::make_unique<TiledMemoryLayerT<T>>(name, width_, height_, tileSize, tileSize);
    LayerT<T> *p = layer.get();
    return addLayer(std::move(layer)) ? p : nullptr;
}

template <typename T>
bool Frame::pasteRegion(const std::string &name, const Region &region, const T *data,
                        int64_t stride) {
    Layer *l = typedLayer(name, layerKindOf<T>(), true);
    return l && static_cast<LayerT<T> *>(l)->paste(region, data, stride);
}

template <typename T>
bool Frame::readRegion(const std::string &name, const Region &region, T *data, int64_t stride) {
    Layer *l = typedLayer(name, layerKindOf<T>(), false);
    return l && static_cast<LayerT<T> *>(l)->read(region, data, stride);
}

}  // namespace ox
