#include "render/layer_tiled.h"

#include <algorithm>
#include <cstring>

#include "core/check.h"
#include "core/message.h"

namespace ox {

// --- Storage ---------------------------------------------------------------------------------

template <typename T>
TiledStorageT<T>::TiledStorageT(int32_t width, int32_t height, int32_t tileWidth,
                                int32_t tileHeight)
    : tileWidth_(tileWidth), tileHeight_(tileHeight) {
    if (width >= 0 && height >= 0 && tileWidth >= 1 && tileHeight >= 1) {
        tilesPerRow_ = uint32_t((int64_t(width) + tileWidth - 1) / tileWidth);
        tilesPerColumn_ = uint32_t((int64_t(height) + tileHeight - 1) / tileHeight);
    }
}

template <typename T>
MMFileTiledStorageT<T>::MMFileTiledStorageT(int32_t width, int32_t height, int32_t tileWidth,
                                            int32_t tileHeight, uint64_t memoryLimit)
    : TiledStorageT<T>(width, height, tileWidth, tileHeight) {
    if (width < 0 || height < 0 || tileWidth < 1 || tileHeight < 1) return;
    // Whole tiles: the block covers the size rounded up to tile multiples. Every factor is
    // below 2^31, so only the last product can overflow.
    const uint64_t tiles = uint64_t(this->tilesPerRow()) * this->tilesPerColumn();
    uint64_t count = 0;
    if (__builtin_mul_overflow(tiles, this->tileElements(), &count)) return;
    memory_ = std::make_unique<LargeMemory<T>>(count, memoryLimit);
}

template <typename T>
void MMFileTiledStorageT<T>::readTile(uint32_t tx, uint32_t ty, T *destination) {
    const uint64_t n = this->tileElements();
    memory_->copyOut((uint64_t(ty) * this->tilesPerRow() + tx) * n, destination, n);
}

template <typename T>
void MMFileTiledStorageT<T>::writeTile(uint32_t tx, uint32_t ty, const T *source) {
    const uint64_t n = this->tileElements();
    memory_->copyIn((uint64_t(ty) * this->tilesPerRow() + tx) * n, source, n);
}

template <typename T>
T *MMFileTiledStorageT<T>::tileData(uint32_t tx, uint32_t ty) {
    T *data = memory_->data();
    return data ? data + (uint64_t(ty) * this->tilesPerRow() + tx) * this->tileElements()
                : nullptr;
}

// --- Cache -----------------------------------------------------------------------------------

template <typename T>
T *TileStorageCacheT<T>::acquire(uint32_t tx, uint32_t ty, bool partial, bool write) {
    const uint64_t key = keyOf(tx, ty);
    OXScopedLock<StdMutex> lock(mutex_);
    for (Entry &e : entries_)
        if (e.key == key) {
            ++e.pins;
            e.dirty = e.dirty || write;
            return e.buffer.get();
        }
    Entry entry{key, 1, write, nullptr};
    if (entries_.size() >= kCapacity) {
        // The oldest tile that no thread is copying into or out of makes room.
        auto victim = std::find_if(entries_.begin(), entries_.end(),
                                   [](const Entry &e) { return e.pins == 0; });
        if (victim != entries_.end()) {
            // A tile that was only read holds what storage holds already.
            if (victim->dirty) {
                storage_.writeTile(uint32_t(victim->key >> 32), uint32_t(victim->key),
                                   victim->buffer.get());
                ++writes_;
            }
            entry.buffer = std::move(victim->buffer);
            entries_.erase(victim);
        }
    }
    // Below capacity, or every buffer pinned: a new zero-filled buffer.
    if (!entry.buffer) entry.buffer.reset(new T[storage_.tileElements()]());
    if (partial) {
        storage_.readTile(tx, ty, entry.buffer.get());
        ++reads_;
    }
    entries_.push_back(std::move(entry));
    return entries_.back().buffer.get();
}

template <typename T>
void TileStorageCacheT<T>::release(uint32_t tx, uint32_t ty) {
    const uint64_t key = keyOf(tx, ty);
    OXScopedLock<StdMutex> lock(mutex_);
    for (Entry &e : entries_)
        if (e.key == key) {
            OX_CHECK(e.pins > 0);
            --e.pins;
            return;
        }
    OX_CHECK(false && "released tile not in cache");
}

template <typename T>
void TileStorageCacheT<T>::flush() {
    OXScopedLock<StdMutex> lock(mutex_);
    for (Entry &e : entries_) {
        if (!e.dirty) continue;
        storage_.writeTile(uint32_t(e.key >> 32), uint32_t(e.key), e.buffer.get());
        e.dirty = false;
        ++writes_;
    }
}

template <typename T>
void TileStorageCacheT<T>::evictAll() {
    flush();
    OXScopedLock<StdMutex> lock(mutex_);
    for (const Entry &e : entries_) OX_CHECK(e.pins == 0);
    entries_.clear();
}

template <typename T>
size_t TileStorageCacheT<T>::bufferCount() const {
    OXScopedLock<StdMutex> lock(mutex_);
    return entries_.size();
}

template <typename T>
uint64_t TileStorageCacheT<T>::storageReads() const {
    OXScopedLock<StdMutex> lock(mutex_);
    return reads_;
}

template <typename T>
uint64_t TileStorageCacheT<T>::storageWrites() const {
    OXScopedLock<StdMutex> lock(mutex_);
    return writes_;
}

// --- Layer -----------------------------------------------------------------------------------

template <typename T>
TiledMemoryLayerT<T>::TiledMemoryLayerT(std::string name, int32_t width, int32_t height,
                                        int32_t tileWidth, int32_t tileHeight, uint64_t memoryLimit)
    : LayerT<T>(std::move(name), width, height) {
    // A tile buffer is allocated whole: its size is limited like a large render tile's.
    constexpr int64_t kMaxTileBytes = int64_t(1) << 28;
    if (this->hasStorage() && tileWidth >= 1 && tileHeight >= 1 &&
        int64_t(tileWidth) * tileHeight * int64_t(sizeof(T)) <= kMaxTileBytes) {
        storage_ = std::make_unique<MMFileTiledStorageT<T>>(width, height, tileWidth, tileHeight,
                                                            memoryLimit);
    }
    if (!storage_ || !storage_->ok()) {
        message(kMsgError, 6, "Failed to initialize Tiled memory layer");
        this->setNoStorage();
        storage_.reset();
        return;
    }
    cache_ = std::make_unique<TileStorageCacheT<T>>(*storage_);
}

template <typename T>
template <bool kPaste>
void TiledMemoryLayerT<T>::copyRegion(const Region &r, T *data, int64_t stride) {
    if (r.area() == 0) return;
    const int64_t tw = storage_->tileWidth(), th = storage_->tileHeight();
    for (int64_t ty = r.yMin / th; ty <= (r.yMax - 1) / th; ++ty) {
        const int64_t y0 = std::max<int64_t>(r.yMin, ty * th);
        const int64_t y1 = std::min<int64_t>(r.yMax, (ty + 1) * th);
        for (int64_t tx = r.xMin / tw; tx <= (r.xMax - 1) / tw; ++tx) {
            const int64_t x0 = std::max<int64_t>(r.xMin, tx * tw);
            const int64_t x1 = std::min<int64_t>(r.xMax, (tx + 1) * tw);
            // A paste that covers the whole tile need not read it from storage first.
            const bool whole = kPaste && x1 - x0 == tw && y1 - y0 == th;
            const size_t rowBytes = size_t(x1 - x0) * sizeof(T);
            auto copy = [&](T *tile) {
                for (int64_t y = y0; y < y1; ++y) {
                    T *t = tile + (y - ty * th) * tw + (x0 - tx * tw);
                    T *d = data + (y - r.yMin) * stride + (x0 - r.xMin);
                    if constexpr (kPaste)
                        std::memcpy(t, d, rowBytes);
                    else
                        std::memcpy(d, t, rowBytes);
                }
            };
            // Reads of a tile that is not cached, and pastes that replace one whole, go
            // straight to storage: loading the tile would only add a copy (and a write-back).
            if ((!kPaste || whole) && cache_->copyUncached(uint32_t(tx), uint32_t(ty), copy))
                continue;
            copy(cache_->acquire(uint32_t(tx), uint32_t(ty), !whole, kPaste));
            cache_->release(uint32_t(tx), uint32_t(ty));
        }
    }
}

template <typename T>
bool TiledMemoryLayerT<T>::pasteRegion(const Region &region, const void *source, int64_t stride) {
    if (!this->checkAccess(region, source, stride)) return false;
    copyRegion<true>(region, const_cast<T *>(static_cast<const T *>(source)), stride);
    this->notifyRegion(region, source, stride);
    return true;
}

template <typename T>
bool TiledMemoryLayerT<T>::readRegion(const Region &region, void *destination, int64_t stride) {
    if (!this->checkAccess(region, destination, stride)) return false;
    copyRegion<false>(region, static_cast<T *>(destination), stride);
    return true;
}

template <typename T>
bool TiledMemoryLayerT<T>::tileGrid(TileGrid<T> &grid) {
    if (!storage_ || !storage_->tileData(0, 0)) return false;
    // Cached buffers would shadow what is written through the grid.
    cache_->evictAll();
    grid.base = storage_->tileData(0, 0);
    grid.tileWidth = storage_->tileWidth();
    grid.tileHeight = storage_->tileHeight();
    grid.tilesPerRow = storage_->tilesPerRow();
    return true;
}

template class TiledStorageT<bool>;
template class TiledStorageT<float>;
template class TiledStorageT<Color>;
template class MMFileTiledStorageT<bool>;
template class MMFileTiledStorageT<float>;
template class MMFileTiledStorageT<Color>;
template class TileStorageCacheT<bool>;
template class TileStorageCacheT<float>;
template class TileStorageCacheT<Color>;
template class TiledMemoryLayerT<bool>;
template class TiledMemoryLayerT<float>;
template class TiledMemoryLayerT<Color>;

}  // namespace ox
