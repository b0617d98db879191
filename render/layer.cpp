#include "render/layer.h"

#include <algorithm>
#include <vector>

#include "core/message.h"

namespace ox {

// --- LayerObserver ---------------------------------------------------------------------------

void LayerObserver::notify(const Region &, const bool *, int64_t, const std::string &) {
    message(kMsgError, 6, "Non implemented notify called");
}
void LayerObserver::notify(const Region &, const float *, int64_t, const std::string &) {
    message(kMsgError, 6, "Non implemented notify called");
}
void LayerObserver::notify(const Region &, const Color *, int64_t, const std::string &) {
    message(kMsgError, 6, "Non implemented notify called");
}
void LayerObserver::notify(const Region &, const float *, int64_t, int32_t, const std::string &) {
    message(kMsgError, 6, "Non implemented notify called");
}
void LayerObserver::synchronize(LayerT<float> &) {
    message(kMsgError, 6, "Non implemented synchronize called");
}
void LayerObserver::synchronize(LayerT<Color> &) {
    message(kMsgError, 6, "Non implemented synchronize called");
}
void LayerObserver::synchronize(CustomFloatLayer &) {
    message(kMsgError, 6, "Non implemented synchronize called");
}

// --- Layer -----------------------------------------------------------------------------------

Layer::Layer(std::string name, LayerKind kind, int32_t width, int32_t height)
    : name_(std::move(name)), kind_(kind), width_(width), height_(height) {
    if (width < 0 || height < 0) {
        width_ = height_ = 0;
        hasStorage_ = false;
    }
}

// The registrations go with the layer: an observer is never called for a destroyed layer.
Layer::~Layer() = default;

void Layer::registerObserver(LayerObserver *observer) {
    if (!observer) return;
    if (std::find(observers_.begin(), observers_.end(), observer) != observers_.end()) {
        message(kMsgError, 6, "Layer observer double registred for layer %s", name_.c_str());
        return;
    }
    observers_.push_back(observer);
}

void Layer::unregisterObserver(LayerObserver *observer) {
    auto it = std::find(observers_.begin(), observers_.end(), observer);
    if (it == observers_.end()) {
        message(kMsgError, 6, "Deleted layer observer didn't exist in layer %s", name_.c_str());
        return;
    }
    observers_.erase(it);
}

bool Layer::checkAccess(const Region &r, const void *data, int64_t &stride) const {
    if (!hasStorage_) return false;
    if (!r.valid || r.xMin > r.xMax || r.yMin > r.yMax) {
        message(kMsgError, 6, "Invalid region (%d, %d)-(%d, %d) for layer %s", r.xMin, r.yMin,
                r.xMax, r.yMax, name_.c_str());
        return false;
    }
    if (r.xMin < 0 || r.yMin < 0 || r.xMax > width_ || r.yMax > height_) {
        message(kMsgError, 6, "Region (%d, %d)-(%d, %d) reaches outside layer %s of %d x %d",
                r.xMin, r.yMin, r.xMax, r.yMax, name_.c_str(), width_, height_);
        return false;
    }
    if (stride == -1) stride = r.width();
    if (stride < r.width()) {
        message(kMsgError, 6, "Row stride %lld is below the region width %lld in layer %s",
                (long long)stride, (long long)r.width(), name_.c_str());
        return false;
    }
    if (!data && r.area() > 0) {
        message(kMsgError, 6, "No pixel data given for layer %s", name_.c_str());
        return false;
    }
    return true;
}

// --- LayerT, CustomFloatLayer ----------------------------------------------------------------

template <typename T>
void LayerT<T>::synchronize() {
    // Observers show float and colour layers; boolean layers have nothing to synchronise.
    if constexpr (!std::is_same_v<T, bool>) {
        for (LayerObserver *o : observers()) o->synchronize(*this);
    }
}

template <typename T>
void LayerT<T>::notifyRegion(const Region &region, const void *data, int64_t stride) {
    if (stride == -1) stride = region.width();
    for (LayerObserver *o : observers())
        if (o->wantsNotifications())
            o->notify(region, static_cast<const T *>(data), stride, name());
}

void CustomFloatLayer::synchronize() {
    for (LayerObserver *o : observers()) o->synchronize(*this);
}

void CustomFloatLayer::notifyRegion(const Region &region, const void *data, int64_t stride) {
    if (stride == -1) stride = region.width();
    for (LayerObserver *o : observers())
        if (o->wantsNotifications())
            o->notify(region, static_cast<const float *>(data), stride, channels_, name());
}

template class LayerT<bool>;
template class LayerT<float>;
template class LayerT<Color>;

// --- Linear storage --------------------------------------------------------------------------

template <typename T>
LinearRows<T>::LinearRows(int32_t width, int32_t height, int32_t units, uint64_t memoryLimit)
    : width_(width), units_(units) {
    if (width < 0 || height < 0 || units < 1) return;
    uint64_t count = 0;
    if (__builtin_mul_overflow(uint64_t(width) * uint64_t(height), uint64_t(units), &count)) return;
    memory_ = std::make_unique<LargeMemory<T>>(count, memoryLimit);
}

template <typename T>
void LinearRows<T>::paste(const Region &r, const T *source, int64_t stride) {
    const uint64_t n = uint64_t(r.width() * units_);
    if (n == 0) return;
    for (int64_t y = r.yMin; y < r.yMax; ++y)
        memory_->copyIn(uint64_t((y * width_ + r.xMin) * units_),
                        source + (y - r.yMin) * stride * units_, n);
}

template <typename T>
void LinearRows<T>::read(const Region &r, T *destination, int64_t stride) {
    const uint64_t n = uint64_t(r.width() * units_);
    if (n == 0) return;
    for (int64_t y = r.yMin; y < r.yMax; ++y)
        memory_->copyOut(uint64_t((y * width_ + r.xMin) * units_),
                         destination + (y - r.yMin) * stride * units_, n);
}

template <typename T>
LinearMemoryLayerT<T>::LinearMemoryLayerT(std::string name, int32_t width, int32_t height,
                                          uint64_t memoryLimit)
    : LayerT<T>(std::move(name), width, height), rows_(width, height, 1, memoryLimit) {
    if (!this->hasStorage() || !rows_.ok()) {
        message(kMsgError, 6, "Failed to initialize linear memory layer");
        this->setNoStorage();
    }
}

template <typename T>
bool LinearMemoryLayerT<T>::pasteRegion(const Region &region, const void *source, int64_t stride) {
    if (!this->checkAccess(region, source, stride)) return false;
    rows_.paste(region, static_cast<const T *>(source), stride);
    this->notifyRegion(region, source, stride);
    return true;
}

template <typename T>
bool LinearMemoryLayerT<T>::readRegion(const Region &region, void *destination, int64_t stride) {
    if (!this->checkAccess(region, destination, stride)) return false;
    rows_.read(region, static_cast<T *>(destination), stride);
    return true;
}

template class LinearRows<bool>;
template class LinearRows<float>;
template class LinearRows<Color>;
template class LinearMemoryLayerT<bool>;
template class LinearMemoryLayerT<float>;
template class LinearMemoryLayerT<Color>;

LinearMemoryLayerCF::LinearMemoryLayerCF(std::string name, int32_t width, int32_t height,
                                         int32_t channels, uint64_t memoryLimit)
    : CustomFloatLayer(std::move(name), width, height, channels),
      rows_(width, height, channels, memoryLimit) {
    if (!hasStorage() || !rows_.ok()) {
        message(kMsgError, 6, "Failed to initialize linear memory layer");
        setNoStorage();
    }
}

bool LinearMemoryLayerCF::pasteRegion(const Region &region, const void *source, int64_t stride) {
    if (!checkAccess(region, source, stride)) return false;
    rows_.paste(region, static_cast<const float *>(source), stride);
    notifyRegion(region, source, stride);
    return true;
}

bool LinearMemoryLayerCF::readRegion(const Region &region, void *destination, int64_t stride) {
    if (!checkAccess(region, destination, stride)) return false;
    rows_.read(region, static_cast<float *>(destination), stride);
    return true;
}

// --- Views -----------------------------------------------------------------------------------

namespace {

/// A buffer of a region's pixels of `units` floats each; false (with a message) when the
/// region is too large to hold in memory at once.
bool regionBuffer(const Region &r, int64_t units, std::vector<float> &buffer) {
    const uint64_t n = uint64_t(r.area()) * uint64_t(units);
    if (n > (uint64_t(1) << 32)) {
        message(kMsgError, 6, "Region of %lld x %lld pixels is too large for a layer view",
                (long long)r.width(), (long long)r.height());
        return false;
    }
    buffer.assign(size_t(n), 0.0f);
    return true;
}

}  // namespace

ColorFromCFLayer::ColorFromCFLayer(std::string name, CustomFloatLayer &source,
                                   int32_t channelOffset)
    : LayerT<Color>(std::move(name), source.width(), source.height()),
      source_(source),
      offset_(channelOffset) {}

bool ColorFromCFLayer::pasteRegion(const Region &, const void *, int64_t) {
    message(kMsgError, 6, "Use ColorFromCFLayerRW instead");
    return false;
}

bool ColorFromCFLayer::readRegion(const Region &region, void *destination, int64_t stride) {
    if (!checkAccess(region, destination, stride)) return false;
    const int32_t n = source_.channels();
    std::vector<float> cf;
    if (!regionBuffer(region, n, cf) || !source_.read(region, cf.data())) return false;
    Color *out = static_cast<Color *>(destination);
    const int64_t w = region.width();
    for (int64_t y = 0; y < region.height(); ++y)
        for (int64_t x = 0; x < w; ++x) {
            const float *p = cf.data() + (y * w + x) * n;
            float v[4];
            for (int c = 0; c < 4; ++c) {
                const int64_t ch = int64_t(offset_) + c;
                v[c] = ch >= 0 && ch < n ? p[ch] : (c == 3 ? 1.0f : 0.0f);
            }
            out[y * stride + x] = Color(v[0], v[1], v[2], v[3]);
        }
    return true;
}

bool ColorFromCFLayerRW::pasteRegion(const Region &region, const void *source, int64_t stride) {
    if (!checkAccess(region, source, stride)) return false;
    const int32_t n = source_.channels();
    std::vector<float> cf;
    if (!regionBuffer(region, n, cf) || !source_.read(region, cf.data())) return false;
    const Color *in = static_cast<const Color *>(source);
    const int64_t w = region.width();
    for (int64_t y = 0; y < region.height(); ++y)
        for (int64_t x = 0; x < w; ++x) {
            const Color &c = in[y * stride + x];
            const float v[4] = {c.r, c.g, c.b, c.a};
            float *p = cf.data() + (y * w + x) * n;
            for (int k = 0; k < 4; ++k) {
                const int64_t ch = int64_t(offset_) + k;
                if (ch >= 0 && ch < n) p[ch] = v[k];
            }
        }
    if (!source_.paste(region, cf.data())) return false;
    notifyRegion(region, source, stride);
    return true;
}

CFFromColorLayer::CFFromColorLayer(std::string name, LayerT<Color> &source)
    : CustomFloatLayer(std::move(name), source.width(), source.height(), 4), source_(source) {}

bool CFFromColorLayer::pasteRegion(const Region &, const void *, int64_t) {
    message(kMsgError, 6, "CFFromColorLayer.pasteRegion not implemented");
    message(kMsgError, 6, "Use CFFromColorLayerRW instead");
    return false;
}

bool CFFromColorLayer::readRegion(const Region &region, void *destination, int64_t stride) {
    if (!checkAccess(region, destination, stride)) return false;
    // Color is four packed floats, so whole rows can be read straight into the destination.
    static_assert(sizeof(Color) == 4 * sizeof(float));
    return source_.read(region, static_cast<Color *>(destination), stride);
}

CFFromFloatLayerRW::CFFromFloatLayerRW(std::string name, LayerT<float> &source)
    : CustomFloatLayer(std::move(name), source.width(), source.height(), 1), source_(source) {}

bool CFFromFloatLayerRW::pasteRegion(const Region &region, const void *source, int64_t stride) {
    if (!checkAccess(region, source, stride)) return false;
    if (!source_.paste(region, static_cast<const float *>(source), stride)) return false;
    notifyRegion(region, source, stride);
    return true;
}

bool CFFromFloatLayerRW::readRegion(const Region &region, void *destination, int64_t stride) {
    if (!checkAccess(region, destination, stride)) return false;
    return source_.read(region, static_cast<float *>(destination), stride);
}

}  // namespace ox
