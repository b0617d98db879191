#pragma once

#include <cstdint>
#include <memory>
#include <vector>

#include "platform/mutex.h"
#include "render/large_memory.h"
#include "render/layer.h"

/// Tiled layers: a backing store of fixed-size tiles and a small cache of tile buffers in
/// front of it, in which tiles in use are pinned.
namespace ox {

/// The backing store of a tiled layer: tile (tx, ty) of tileWidth x tileHeight elements,
/// row-major inside, lies at (ty * tilesPerRow + tx) * tileWidth * tileHeight.
template <typename T>
class TiledStorageT {
public:
    virtual ~TiledStorageT() = default;
    /// Copies tile (tx, ty) out to destination (tileWidth * tileHeight elements).
    virtual void readTile(uint32_t tx, uint32_t ty, T *destination) = 0;
    /// Copies source into tile (tx, ty).
    virtual void writeTile(uint32_t tx, uint32_t ty, const T *source) = 0;
    /// The elements of tile (tx, ty) in place, or null when the storage is not addressable.
    virtual T *tileData(uint32_t, uint32_t) { return nullptr; }

    int32_t tileWidth() const { return tileWidth_; }
    int32_t tileHeight() const { return tileHeight_; }
    /// ceil(width / tileWidth).
    uint32_t tilesPerRow() const { return tilesPerRow_; }
    /// ceil(height / tileHeight).
    uint32_t tilesPerColumn() const { return tilesPerColumn_; }
    /// Elements per tile.
    uint64_t tileElements() const { return uint64_t(tileWidth_) * uint64_t(tileHeight_); }

protected:
    TiledStorageT(int32_t width, int32_t height, int32_t tileWidth, int32_t tileHeight);

private:
    int32_t tileWidth_, tileHeight_;
    uint32_t tilesPerRow_ = 0, tilesPerColumn_ = 0;
};

/// Tiles in one zero-filled LargeMemory block (spilling to a temporary file when large).
template <typename T>
class MMFileTiledStorageT final : public TiledStorageT<T> {
public:
    /// Storage for width x height elements in tiles of tileWidth x tileHeight (both >= 1).
    MMFileTiledStorageT(int32_t width, int32_t height, int32_t tileWidth, int32_t tileHeight,
                        uint64_t memoryLimit = MemoryMappedFile::kMemoryLimit);
    /// True when the block was obtained.
    bool ok() const { return memory_ && memory_->ok(); }
    /// True when the block lives in a temporary file.
    bool isFileBacked() const { return memory_ && memory_->isFileBacked(); }
    void readTile(uint32_t tx, uint32_t ty, T *destination) override;
    void writeTile(uint32_t tx, uint32_t ty, const T *source) override;
    T *tileData(uint32_t tx, uint32_t ty) override;

private:
    std::unique_ptr<LargeMemory<T>> memory_;
};

/// A cache of tile buffers over a TiledStorageT. A tile handed out by acquire is pinned until
/// release: it is never written back, evicted or reused meanwhile. Eviction takes the oldest
/// loaded unpinned tile (first loaded, first evicted; a hit does not refresh a tile) and writes
/// it back only when it was acquired for writing since it was loaded or written back. When
/// every buffer is pinned the cache grows by one buffer instead of waiting. Thread-safe.
template <typename T>
class TileStorageCacheT {
public:
    /// The number of buffers the cache holds before it evicts.
    static constexpr size_t kCapacity = 30;

    /// A cache over storage (which must outlive it).
    explicit TileStorageCacheT(TiledStorageT<T> &storage) : storage_(storage) {}
    /// Tiles still cached are not written back: the storage goes with the cache's owner.
    ~TileStorageCacheT() = default;

    /// The buffer of tile (tx, ty), pinned. A tile not cached is filled from storage when
    /// partial (the caller will overwrite only part of it); otherwise its contents are
    /// undefined until the caller has written all of it. A tile acquired with write false is
    /// only read by the caller and is not marked for writing back.
    T *acquire(uint32_t tx, uint32_t ty, bool partial, bool write = true);
    /// When tile (tx, ty) is not cached and its storage is addressable, runs copy(tile) on the
    /// storage itself under the cache's lock (no load, no write-back) and returns true;
    /// otherwise returns false without running it.
    template <typename F>
    bool copyUncached(uint32_t tx, uint32_t ty, F &&copy) {
        const uint64_t key = keyOf(tx, ty);
        OXScopedLock<StdMutex> lock(mutex_);
        for (const Entry &e : entries_)
            if (e.key == key) return false;
        T *tile = storage_.tileData(tx, ty);
        if (!tile) return false;
        copy(tile);
        return true;
    }
    /// Unpins a tile acquired before.
    void release(uint32_t tx, uint32_t ty);
    /// Writes every cached tile marked for writing back to storage (pinned ones included: call
    /// without pastes running).
    void flush();
    /// Writes back and forgets every cached tile, so that storage alone holds the pixels (call
    /// without pastes or reads running).
    void evictAll();

    /// Buffers held (kCapacity, or more while all were pinned at once).
    size_t bufferCount() const;
    /// Tiles read from storage so far.
    uint64_t storageReads() const;
    /// Tiles written back to storage so far.
    uint64_t storageWrites() const;

private:
    struct Entry {
        uint64_t key;
        uint32_t pins;
        bool dirty;
        std::unique_ptr<T[]> buffer;
    };
    static uint64_t keyOf(uint32_t tx, uint32_t ty) { return (uint64_t(tx) << 32) | ty; }

    TiledStorageT<T> &storage_;
    std::vector<Entry> entries_;  // load order, oldest first
    mutable StdMutex mutex_{true};
    uint64_t reads_ = 0, writes_ = 0;
};

/// A boolean, float or colour layer in tiles: a TileStorageCacheT over an
/// MMFileTiledStorageT. Pastes into disjoint regions may run from any number of threads.
template <typename T>
class TiledMemoryLayerT final : public LayerT<T> {
public:
    /// A zero-filled layer in tiles of tileWidth x tileHeight; a block that cannot be
    /// obtained (or a tile edge below 1) is reported with "Failed to initialize Tiled memory
    /// layer" and the layer refuses every paste and read.
    TiledMemoryLayerT(std::string name, int32_t width, int32_t height,
                      int32_t tileWidth = kLayerTileSize, int32_t tileHeight = kLayerTileSize,
                      uint64_t memoryLimit = MemoryMappedFile::kMemoryLimit);
    bool pasteRegion(const Region &region, const void *source, int64_t stride) override;
    bool readRegion(const Region &region, void *destination, int64_t stride) override;
    bool tileGrid(TileGrid<T> &grid) override;

    /// The tile width in pixels.
    int32_t tileWidth() const { return storage_ ? storage_->tileWidth() : 0; }
    /// The tile height in pixels.
    int32_t tileHeight() const { return storage_ ? storage_->tileHeight() : 0; }
    /// The tile cache (for tests and diagnostics).
    const TileStorageCacheT<T> *cache() const { return cache_.get(); }
    /// True when the tiles live in a temporary file.
    bool isFileBacked() const { return storage_ && storage_->isFileBacked(); }

private:
    template <bool kPaste>
    void copyRegion(const Region &region, T *data, int64_t stride);

    std::unique_ptr<MMFileTiledStorageT<T>> storage_;
    std::unique_ptr<TileStorageCacheT<T>> cache_;
};

}  // namespace ox
