#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "core/types.h"
#include "render/large_memory.h"

/// Frame layers: the abstract layer, its observers, the typed layers with linear storage and
/// the views that show a custom-float layer as colours and back.
///
/// Orientation: row 0 of a layer is the bottom row of the picture. Pixel (x, y) is element
/// y * width + x; regions have inclusive minima and exclusive maxima.
namespace ox {

/// The kind of a layer; stored as these integers.
enum LayerKind : int32_t {
    kLayerBool = 0,         ///< one byte per pixel
    kLayerFloat = 1,        ///< one float per pixel
    kLayerColor = 2,        ///< one Color per pixel
    kLayerCustomFloat = 3,  ///< N floats per pixel
};

/// The kind of the typed layer of element T (bool, float or Color).
template <typename T>
constexpr LayerKind layerKindOf();
template <>
constexpr LayerKind layerKindOf<bool>() {
    return kLayerBool;
}
template <>
constexpr LayerKind layerKindOf<float>() {
    return kLayerFloat;
}
template <>
constexpr LayerKind layerKindOf<Color>() {
    return kLayerColor;
}

/// The tile edge of every tiled layer the render, bake and crop paths create.
constexpr int32_t kLayerTileSize = 64;

class Layer;
template <typename T>
class LayerT;
class CustomFloatLayer;

/// Told of every region pasted into a layer it is registered on (preview window, progress
/// displays). Called on the pasting thread: implementations must be thread-safe.
class LayerObserver {
public:
    virtual ~LayerObserver() = default;
    /// The name of the layer this observer shows.
    virtual std::string observedLayer() const = 0;
    /// A region of a boolean layer was pasted; data holds its rows at stride elements.
    virtual void notify(const Region &region, const bool *data, int64_t stride,
                        const std::string &layerName);
    /// A region of a float layer was pasted.
    virtual void notify(const Region &region, const float *data, int64_t stride,
                        const std::string &layerName);
    /// A region of a colour layer was pasted.
    virtual void notify(const Region &region, const Color *data, int64_t stride,
                        const std::string &layerName);
    /// A region of a custom-float layer of `channels` floats per pixel was pasted; stride is
    /// in pixels.
    virtual void notify(const Region &region, const float *data, int64_t stride, int32_t channels,
                        const std::string &layerName);
    /// The float layer asks to be shown whole.
    virtual void synchronize(LayerT<float> &layer);
    /// The colour layer asks to be shown whole.
    virtual void synchronize(LayerT<Color> &layer);
    /// The custom-float layer asks to be shown whole.
    virtual void synchronize(CustomFloatLayer &layer);
    /// False to be skipped by notifyRegion.
    virtual bool wantsNotifications() const { return true; }
};

/// A named image of one kind. Every layer derives from LayerT<bool|float|Color> or from
/// CustomFloatLayer, whose kinds match their element types. Pastes and reads of disjoint
/// regions may run concurrently from any thread; observers are registered only while no
/// pastes run.
class Layer {
public:
    virtual ~Layer();
    Layer(const Layer &) = delete;
    Layer &operator=(const Layer &) = delete;

    /// Calls every observer's synchronize for this layer's kind.
    virtual void synchronize() = 0;
    /// Copies a region in from source, whose rows lie stride elements apart (-1: the region
    /// width), then notifies the observers. False, with one message, for a region that is
    /// invalid or reaches outside [0, width) x [0, height), a stride below the region width,
    /// or a layer that cannot be written; nothing is written then.
    virtual bool pasteRegion(const Region &region, const void *source, int64_t stride) = 0;
    /// Copies a region out to destination at stride elements per row (-1: the region width);
    /// refused like pasteRegion.
    virtual bool readRegion(const Region &region, void *destination, int64_t stride) = 0;
    /// Calls every observer's notify for this layer's kind.
    virtual void notifyRegion(const Region &region, const void *data, int64_t stride) = 0;

    /// The layer's name.
    const std::string &name() const { return name_; }
    /// The layer's kind.
    LayerKind kind() const { return kind_; }
    /// Width in pixels.
    int32_t width() const { return width_; }
    /// Height in pixels.
    int32_t height() const { return height_; }
    /// False when the storage could not be obtained (reported once, at creation).
    bool hasStorage() const { return hasStorage_; }

    /// Registers an observer; a second registration of the same one is reported and ignored.
    void registerObserver(LayerObserver *observer);
    /// Removes an observer; one that is not registered is reported.
    void unregisterObserver(LayerObserver *observer);
    /// The registered observers.
    const std::vector<LayerObserver *> &observers() const { return observers_; }

protected:
    Layer(std::string name, LayerKind kind, int32_t width, int32_t height);

    /// Checks a paste or read: region inside the layer, data present, stride at least the
    /// region width (-1 is replaced by it). False after one message; a layer without storage
    /// refuses silently.
    bool checkAccess(const Region &region, const void *data, int64_t &stride) const;
    /// Marks the layer as unusable after its one initialisation message.
    void setNoStorage() { hasStorage_ = false; }

private:
    friend class Frame;
    std::string name_;
    LayerKind kind_;
    int32_t width_, height_;
    bool hasStorage_ = true;
    std::vector<LayerObserver *> observers_;
};

/// A layer's pixels in place, in tiles of tileWidth x tileHeight stored one after another in
/// row-major tile order, each tile row-major inside.
template <typename T>
struct TileGrid {
    T *base = nullptr;
    int32_t tileWidth = 0, tileHeight = 0;
    uint32_t tilesPerRow = 0;

    /// The first pixel of tile (tx, ty); its rows lie tileWidth elements apart.
    T *tile(uint32_t tx, uint32_t ty) const {
        return base +
               (uint64_t(ty) * tilesPerRow + tx) * uint64_t(tileWidth) * uint64_t(tileHeight);
    }
    /// True when both grids cut the image the same way.
    template <typename U>
    bool sameTiles(const TileGrid<U> &o) const {
        return tileWidth == o.tileWidth && tileHeight == o.tileHeight &&
               tilesPerRow == o.tilesPerRow;
    }
};

/// The base of the boolean, float and colour layers.
template <typename T>
class LayerT : public Layer {
public:
    using Element = T;
    /// The pixels in place, for band work that would otherwise copy every pixel out and back:
    /// false when the layer keeps no addressable tiles. After a true return, and until the
    /// caller is done with the grid, the layer may be used only through the grid (no paste,
    /// no read); threads may work on disjoint pixels of it at once. Writes through the grid
    /// notify no observer.
    virtual bool tileGrid(TileGrid<T> &grid) {
        (void)grid;
        return false;
    }
    /// Typed pasteRegion.
    bool paste(const Region &region, const T *source, int64_t stride = -1) {
        return pasteRegion(region, source, stride);
    }
    /// Typed readRegion.
    bool read(const Region &region, T *destination, int64_t stride = -1) {
        return readRegion(region, destination, stride);
    }
    void synchronize() override;
    void notifyRegion(const Region &region, const void *data, int64_t stride) override;

protected:
    LayerT(std::string name, int32_t width, int32_t height)
        : Layer(std::move(name), layerKindOf<T>(), width, height) {}
};

/// The base of the layers of N floats per pixel; N is fixed at creation.
class CustomFloatLayer : public Layer {
public:
    /// Floats per pixel.
    int32_t channels() const { return channels_; }
    /// Typed pasteRegion; stride in pixels.
    bool paste(const Region &region, const float *source, int64_t stride = -1) {
        return pasteRegion(region, source, stride);
    }
    /// Typed readRegion; stride in pixels.
    bool read(const Region &region, float *destination, int64_t stride = -1) {
        return readRegion(region, destination, stride);
    }
    void synchronize() override;
    void notifyRegion(const Region &region, const void *data, int64_t stride) override;

protected:
    CustomFloatLayer(std::string name, int32_t width, int32_t height, int32_t channels)
        : Layer(std::move(name), kLayerCustomFloat, width, height), channels_(channels) {}

private:
    int32_t channels_;
};

/// Row copies between caller buffers and one linear block of `units` values of T per pixel.
template <typename T>
class LinearRows {
public:
    LinearRows(int32_t width, int32_t height, int32_t units, uint64_t memoryLimit);
    bool ok() const { return memory_ && memory_->ok(); }
    bool isFileBacked() const { return memory_ && memory_->isFileBacked(); }
    void paste(const Region &region, const T *source, int64_t stride);
    void read(const Region &region, T *destination, int64_t stride);

private:
    int64_t width_;
    int64_t units_;
    std::unique_ptr<LargeMemory<T>> memory_;
};

/// A boolean, float or colour layer in one block of width x height elements.
template <typename T>
class LinearMemoryLayerT final : public LayerT<T> {
public:
    /// A zero-filled layer; a block that cannot be obtained is reported with "Failed to
    /// initialize linear memory layer" and the layer refuses every paste and read.
    LinearMemoryLayerT(std::string name, int32_t width, int32_t height,
                       uint64_t memoryLimit = MemoryMappedFile::kMemoryLimit);
    bool pasteRegion(const Region &region, const void *source, int64_t stride) override;
    bool readRegion(const Region &region, void *destination, int64_t stride) override;
    /// True when the pixels live in a temporary file.
    bool isFileBacked() const { return rows_.isFileBacked(); }

private:
    LinearRows<T> rows_;
};

/// A custom-float layer in one block of width x height x N floats.
class LinearMemoryLayerCF final : public CustomFloatLayer {
public:
    /// A zero-filled layer of `channels` floats per pixel (at least 1); failures as for
    /// LinearMemoryLayerT.
    LinearMemoryLayerCF(std::string name, int32_t width, int32_t height, int32_t channels,
                        uint64_t memoryLimit = MemoryMappedFile::kMemoryLimit);
    bool pasteRegion(const Region &region, const void *source, int64_t stride) override;
    bool readRegion(const Region &region, void *destination, int64_t stride) override;

private:
    LinearRows<float> rows_;
};

/// A read-only colour view of four channels of a custom-float layer, from channel offset c:
/// r, g, b, a = channels c to c + 3; a channel at or beyond N reads 0 for r, g, b and 1 for a.
class ColorFromCFLayer : public LayerT<Color> {
public:
    /// A view named name over source (which must outlive it).
    ColorFromCFLayer(std::string name, CustomFloatLayer &source, int32_t channelOffset);
    /// Refused: the view is read-only ("Use ColorFromCFLayerRW instead").
    bool pasteRegion(const Region &region, const void *source, int64_t stride) override;
    bool readRegion(const Region &region, void *destination, int64_t stride) override;

protected:
    CustomFloatLayer &source_;
    int32_t offset_;
};

/// The colour view of ColorFromCFLayer that also writes: a paste stores r, g, b, a in the
/// channels that exist and leaves the others of the source untouched.
class ColorFromCFLayerRW final : public ColorFromCFLayer {
public:
    using ColorFromCFLayer::ColorFromCFLayer;
    bool pasteRegion(const Region &region, const void *source, int64_t stride) override;
};

/// A read-only four-channel custom-float view of a colour layer (r, g, b, a).
class CFFromColorLayer final : public CustomFloatLayer {
public:
    /// A view named name over source (which must outlive it).
    CFFromColorLayer(std::string name, LayerT<Color> &source);
    /// Refused: the view is read-only.
    bool pasteRegion(const Region &region, const void *source, int64_t stride) override;
    bool readRegion(const Region &region, void *destination, int64_t stride) override;

private:
    LayerT<Color> &source_;
};

/// A one-channel custom-float view of a float layer, readable and writable.
class CFFromFloatLayerRW final : public CustomFloatLayer {
public:
    /// A view named name over source (which must outlive it).
    CFFromFloatLayerRW(std::string name, LayerT<float> &source);
    bool pasteRegion(const Region &region, const void *source, int64_t stride) override;
    bool readRegion(const Region &region, void *destination, int64_t stride) override;

private:
    LayerT<float> &source_;
};

}  // namespace ox
