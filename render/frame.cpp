#include "render/frame.h"

#include <algorithm>
#include <new>
#include <vector>

#include "core/message.h"
#include "platform/memory_mapped_file.h"

namespace ox {

// --- Scratch memory --------------------------------------------------------------------------

namespace {

constexpr std::align_val_t kScratchAlign{64};

/// Blocks from a huge page on live on huge pages (a fresh table of a large frame then faults
/// in 2 MiB at a time); smaller ones come from the heap.
void *newBlock(size_t bytes) {
    if (bytes >= kHugePage) return allocateHugeBlock(bytes, false);
    return ::operator new(bytes, kScratchAlign, std::nothrow);
}

void deleteBlock(void *data, size_t bytes) {
    if (bytes >= kHugePage)
        releaseHugeBlock(data, bytes);
    else
        ::operator delete(data, kScratchAlign);
}

}  // namespace

ScratchBlock &ScratchBlock::operator=(ScratchBlock &&o) noexcept {
    if (this != &o) {
        reset();
        pool_ = o.pool_, data_ = o.data_, bytes_ = o.bytes_;
        o.pool_ = nullptr, o.data_ = nullptr, o.bytes_ = 0;
    }
    return *this;
}

void ScratchBlock::reset() {
    if (data_) pool_->giveBack(data_, bytes_);
    pool_ = nullptr, data_ = nullptr, bytes_ = 0;
}

ScratchBlock ScratchPool::borrow(size_t bytes) {
    ScratchBlock block;
    if (bytes == 0) bytes = 1;
    {
        std::lock_guard<std::mutex> lock(mutex_);
        // The smallest kept block that fits, unless it is so much larger that a later, larger
        // request would miss it.
        auto best = kept_.end();
        for (auto it = kept_.begin(); it != kept_.end(); ++it)
            if (it->bytes >= bytes && it->bytes / 4 <= bytes &&
                (best == kept_.end() || it->bytes < best->bytes))
                best = it;
        if (best != kept_.end()) {
            block.pool_ = this, block.data_ = best->data, block.bytes_ = best->bytes;
            kept_.erase(best);
            return block;
        }
    }
    // A huge block is rounded to whole pages: the rest of its last page is usable too.
    if (bytes >= kHugePage) bytes = (bytes + kHugePage - 1) & ~size_t(kHugePage - 1);
    void *data = newBlock(bytes);
    if (data) block.pool_ = this, block.data_ = data, block.bytes_ = bytes;
    return block;
}

void ScratchPool::giveBack(void *data, size_t bytes) {
    std::lock_guard<std::mutex> lock(mutex_);
    if (kept_.size() >= kKeptBlocks) {
        // The smallest block goes: it is the cheapest to make again.
        auto smallest =
            std::min_element(kept_.begin(), kept_.end(),
                             [](const Kept &a, const Kept &b) { return a.bytes < b.bytes; });
        if (smallest->bytes >= bytes) {
            deleteBlock(data, bytes);
            return;
        }
        deleteBlock(smallest->data, smallest->bytes);
        kept_.erase(smallest);
    }
    kept_.push_back({data, bytes});
}

void ScratchPool::release() {
    std::lock_guard<std::mutex> lock(mutex_);
    for (const Kept &k : kept_) deleteBlock(k.data, k.bytes);
    kept_.clear();
}

size_t ScratchPool::keptBytes() const {
    std::lock_guard<std::mutex> lock(mutex_);
    size_t total = 0;
    for (const Kept &k : kept_) total += k.bytes;
    return total;
}

bool Frame::addLayer(std::unique_ptr<Layer> layer) {
    if (!layer) return false;
    const std::string &name = layer->name();
    if (hasLayer(name)) {
        message(kMsgError, 6, "Layer %s already exists in the frame", name.c_str());
        return false;
    }
    if (layer->width() != width_ || layer->height() != height_) {
        message(kMsgError, 6, "Layer %s of %d x %d does not fit the frame of %d x %d", name.c_str(),
                layer->width(), layer->height(), width_, height_);
        return false;
    }
    // A layer without storage has reported its failure already.
    if (!layer->hasStorage()) return false;
    layers_.emplace(name, std::move(layer));
    return true;
}

CustomFloatLayer *Frame::addCustomFloatLayer(const std::string &name, int32_t channels) {
    auto layer = std::make_unique<LinearMemoryLayerCF>(name, width_, height_, channels);
    CustomFloatLayer *p = layer.get();
    return addLayer(std::move(layer)) ? p : nullptr;
}

Layer *Frame::getLayer(const std::string &name) const {
    auto it = layers_.find(name);
    return it == layers_.end() ? nullptr : it->second.get();
}

LayerT<bool> *Frame::getBoolLayer(const std::string &name) const {
    Layer *l = getLayer(name);
    return l && l->kind() == kLayerBool ? static_cast<LayerT<bool> *>(l) : nullptr;
}

LayerT<float> *Frame::getFloatLayer(const std::string &name) const {
    Layer *l = getLayer(name);
    return l && l->kind() == kLayerFloat ? static_cast<LayerT<float> *>(l) : nullptr;
}

LayerT<Color> *Frame::getColorLayer(const std::string &name) const {
    Layer *l = getLayer(name);
    return l && l->kind() == kLayerColor ? static_cast<LayerT<Color> *>(l) : nullptr;
}

CustomFloatLayer *Frame::getCFLayer(const std::string &name) const {
    Layer *l = getLayer(name);
    return l && l->kind() == kLayerCustomFloat ? static_cast<CustomFloatLayer *>(l) : nullptr;
}

std::vector<std::string> Frame::layerNames() const {
    std::vector<std::string> names;
    names.reserve(layers_.size());
    for (const auto &[name, layer] : layers_) names.push_back(name);
    return names;
}

Layer *Frame::typedLayer(const std::string &name, LayerKind kind, bool paste) const {
    Layer *l = getLayer(name);
    if (!l) {
        message(kMsgError, 6,
                paste ? "Pasting in non existing layer %s"
                      : "Reading region from non existing layer %s",
                name.c_str());
        return nullptr;
    }
    if (l->kind() != kind) {
        message(kMsgError, 6,
                paste ? "Pasting region of incorrect type in layer %s"
                      : "Reading region from incorrect type in layer %s",
                name.c_str());
        return nullptr;
    }
    return l;
}

bool Frame::pasteCFRegion(const std::string &name, const Region &region, const float *data,
                          int64_t stride) {
    Layer *l = typedLayer(name, kLayerCustomFloat, true);
    return l && static_cast<CustomFloatLayer *>(l)->paste(region, data, stride);
}

bool Frame::readCFRegion(const std::string &name, const Region &region, float *data,
                         int64_t stride) {
    Layer *l = typedLayer(name, kLayerCustomFloat, false);
    return l && static_cast<CustomFloatLayer *>(l)->read(region, data, stride);
}

bool Frame::deleteLayer(const std::string &name) {
    auto it = layers_.find(name);
    if (it == layers_.end()) {
        message(kMsgError, 6, "Deleting non existing layer %s", name.c_str());
        return false;
    }
    layers_.erase(it);
    return true;
}

bool Frame::retireLayer(const std::string &name) {
    std::unique_ptr<Layer> layer = detachLayer(name);
    if (!layer) return false;
    auto *tiled = layer->kind() == kLayerColor
                      ? dynamic_cast<TiledMemoryLayerT<Color> *>(layer.get())
                      : nullptr;
    if (!tiled || tiled->tileWidth() != kLayerTileSize || tiled->tileHeight() != kLayerTileSize)
        return true;  // destroyed here like a deleted layer
    layer->observers_.clear();
    if (retired_.size() >= kRetiredLayers) retired_.erase(retired_.begin());
    retired_.push_back(std::move(layer));
    return true;
}

LayerT<Color> *Frame::addScratchColorLayer(const std::string &name) {
    if (retired_.empty() || hasLayer(name)) return addTiledLayer<Color>(name);
    std::unique_ptr<Layer> layer = std::move(retired_.back());
    retired_.pop_back();
    layer->name_ = name;
    auto *p = static_cast<LayerT<Color> *>(layer.get());
    layers_.emplace(name, std::move(layer));
    return p;
}

std::unique_ptr<Layer> Frame::detachLayer(const std::string &name) {
    auto it = layers_.find(name);
    if (it == layers_.end()) {
        message(kMsgError, 6, "Detaching non existing layer %s", name.c_str());
        return nullptr;
    }
    std::unique_ptr<Layer> layer = std::move(it->second);
    layers_.erase(it);
    return layer;
}

bool Frame::flushLayer(const std::string &name) {
    Layer *l = getLayer(name);
    if (!l) {
        message(kMsgError, 6, "Flüshing non existing layer %s", name.c_str());
        return false;
    }
    l->synchronize();
    return true;
}

bool Frame::renameLayer(const std::string &from, const std::string &to) {
    auto it = layers_.find(from);
    if (it == layers_.end()) {
        message(kMsgError, 6, "Renaming non existing layer %s", from.c_str());
        return false;
    }
    if (from == to) return true;
    if (hasLayer(to)) {
        message(kMsgError, 6, "Layer %s already exists in the frame", to.c_str());
        return false;
    }
    std::unique_ptr<Layer> layer = std::move(it->second);
    layers_.erase(it);
    layer->name_ = to;
    layers_.emplace(to, std::move(layer));
    return true;
}

bool Frame::registerObserver(const std::string &name, LayerObserver *observer) {
    Layer *l = getLayer(name);
    if (!l) {
        message(kMsgError, 6, "Observing non existing layer %s", name.c_str());
        return false;
    }
    l->registerObserver(observer);
    return true;
}

bool Frame::unregisterObserver(const std::string &name, LayerObserver *observer) {
    Layer *l = getLayer(name);
    if (!l) {
        message(kMsgError, 6, "Observing non existing layer %s", name.c_str());
        return false;
    }
    l->unregisterObserver(observer);
    return true;
}

// --- Crop ------------------------------------------------------------------------------------

namespace {

/// Copies region of `source` to (0, 0) of `target` through one buffer of T per pixel unit.
template <typename T, typename Src, typename Dst>
bool copyCropped(Src &source, Dst &target, const Region &region, int64_t units) {
    const uint64_t n = uint64_t(region.area()) * uint64_t(units);
    if (n * sizeof(T) > (uint64_t(1) << 34)) return false;
    std::unique_ptr<T[]> buffer(new T[n]());
    const Region at(0, 0, int32_t(region.width()), int32_t(region.height()));
    return source.read(region, buffer.get()) && target.paste(at, buffer.get());
}

template <typename T>
std::unique_ptr<Layer> cropTyped(Layer &layer, const Region &region, int32_t w, int32_t h) {
    auto out = std::make_unique<TiledMemoryLayerT<T>>(layer.name(), w, h);
    if (!out->hasStorage() || !copyCropped<T>(static_cast<LayerT<T> &>(layer), *out, region, 1))
        return nullptr;
    return out;
}

}  // namespace

std::unique_ptr<Frame> FrameUtils::crop(Frame &frame, const Region &region,
                                        const std::vector<std::string> &layerNames) {
    const int32_t w = int32_t(region.width()), h = int32_t(region.height());
    auto result = std::make_unique<Frame>(w, h);
    for (const std::string &name : layerNames) {
        Layer *layer = frame.getLayer(name);
        if (!layer) {
            message(kMsgError, 6, "Crop failed, layer %s is not present in frame", name.c_str());
            return nullptr;
        }
        std::unique_ptr<Layer> copy;
        switch (layer->kind()) {
            case kLayerBool:
                copy = cropTyped<bool>(*layer, region, w, h);
                break;
            case kLayerFloat:
                copy = cropTyped<float>(*layer, region, w, h);
                break;
            case kLayerColor:
                copy = cropTyped<Color>(*layer, region, w, h);
                break;
            case kLayerCustomFloat: {
                auto &cf = static_cast<CustomFloatLayer &>(*layer);
                auto out = std::make_unique<LinearMemoryLayerCF>(name, w, h, cf.channels());
                if (out->hasStorage() && copyCropped<float>(cf, *out, region, cf.channels()))
                    copy = std::move(out);
                break;
            }
            default:
                message(kMsgError, 6, "Unknown layer type FrameUtils::crop");
                return nullptr;
        }
        if (!copy || !result->addLayer(std::move(copy))) {
            message(kMsgError, 6, "Failed to crop layer %s in FrameUtils::crop", name.c_str());
            return nullptr;
        }
    }
    return result;
}

}  // namespace ox
