#include "render/post_filter.h"

#include <algorithm>
#include <atomic>
#include <exception>
#include <mutex>

#include "core/message.h"
#include "platform/thread.h"
#include "render/frame.h"

namespace ox {

namespace {

/// A helper thread of a RowBands run.
class BandThread final : public OXThread {
public:
    explicit BandThread(std::function<void()> body) : body_(std::move(body)) {}
    ~BandThread() override { join(); }
    std::string name() const override { return "Postfilter Thread"; }

private:
    void run() override { body_(); }
    std::function<void()> body_;
};

}  // namespace

bool RowBands::run(const Body &body) {
    aborted_ = false;
    const int32_t bands = height_ > 0 ? (height_ + bandRows_ - 1) / bandRows_ : 0;
    std::atomic<int32_t> next{0}, rowsDone{0};
    std::atomic<bool> failed{false}, aborted{false};
    float reported = 0.0f;

    auto work = [&](int thread) {
        for (;;) {
            if (failed.load(std::memory_order_relaxed) || aborted.load(std::memory_order_relaxed))
                return;
            if (io_ && io_->isAborted()) {
                aborted = true;
                return;
            }
            const int32_t band = next.fetch_add(1, std::memory_order_relaxed);
            if (band >= bands) return;
            const int32_t y0 = band * bandRows_, y1 = std::min(height_, y0 + bandRows_);
            bool ok = false;
            // Nothing may escape a helper thread: an exception fails the run like false.
            try {
                ok = body(y0, y1, thread);
            } catch (const std::exception &e) {
                message(kMsgError, 6, "Filtering rows %d to %d failed: %s", y0, y1 - 1, e.what());
            } catch (...) {
                message(kMsgError, 6, "Filtering rows %d to %d failed", y0, y1 - 1);
            }
            if (!ok) {
                failed = true;
                return;
            }
            const int32_t done = rowsDone.fetch_add(y1 - y0) + (y1 - y0);
            // Progress comes from the calling thread only, so that it never goes back.
            if (thread == 0 && io_) {
                const float progress = float(done) / float(height_);
                if (progress - reported >= 0.1f) {
                    reported = progress;
                    io_->setProgress(progress);
                }
            }
        }
    };

    std::vector<std::unique_ptr<BandThread>> helpers;
    for (int t = 1; t < std::min(threads_, std::max(bands, 1)); ++t) {
        helpers.push_back(std::make_unique<BandThread>([&work, t] { work(t); }));
        // A helper that cannot start leaves its bands to the others.
        if (!helpers.back()->start()) helpers.pop_back();
    }
    work(0);
    for (auto &h : helpers) h->join();
    if (failed) return false;
    if (aborted || (io_ && io_->isAborted())) {
        aborted_ = true;
        return false;
    }
    return true;
}

// ---------------------------------------------------------------------------------------------

TexelRuns::TexelRuns(LayerT<Color> &in, LayerT<Color> *out, LayerT<float> *z)
    : in_(in), out_(out), z_(z) {
    // Writes through a grid would not reach observers.
    if (out_ && !out_->observers().empty()) return;
    direct_ = in_.tileGrid(inGrid_) &&
              (!out_ || (out_->tileGrid(outGrid_) && outGrid_.sameTiles(inGrid_))) &&
              (!z_ || (z_->tileGrid(zGrid_) && zGrid_.sameTiles(inGrid_)));
}

// ---------------------------------------------------------------------------------------------

bool InPlaceTexels::possible(LayerT<Color> &layer) {
    TileGrid<Color> grid;
    return layer.observers().empty() && layer.tileGrid(grid);
}

InPlaceTexels::InPlaceTexels(LayerT<Color> &layer, ScratchPool &pool)
    : width_(layer.width()), height_(layer.height()) {
    if (!layer.tileGrid(grid_) || grid_.tileWidth <= 0 || grid_.tileHeight <= 0) return;
    done_.assign(size_t(std::max(height_, 0)), 0);
    first_.assign(done_.size(), 0);
    log_ = pool.borrow(std::max<size_t>(size_t(width_) * size_t(height_), 1) * sizeof(Color));
}

// ---------------------------------------------------------------------------------------------

FilterResults::~FilterResults() { discard(); }

bool FilterResults::nameFree(const std::string &name, const char *filterName) const {
    if (!frame_.hasLayer(name)) return true;
    message(kMsgError, 6, "Layer %s already exists; the %s cannot write its result there",
            name.c_str(), filterName);
    return false;
}

LayerT<Color> *FilterResults::addColor(const std::string &name, const std::string &target,
                                       const char *filterName) {
    if (!nameFree(name, filterName)) return nullptr;
    // Every filter writes all of its result before placing it, so recycled storage serves.
    LayerT<Color> *layer = frame_.addScratchColorLayer(name);
    if (layer) entries_.push_back({name, target});
    return layer;
}

bool FilterResults::place(const std::vector<std::string> &sources) {
    // The replaced sources keep their storage for the next filter's result.
    for (const std::string &s : sources)
        if (frame_.hasLayer(s)) frame_.retireLayer(s);
    for (const Entry &e : entries_)
        if (e.target != e.name && frame_.hasLayer(e.target)) frame_.deleteLayer(e.target);
    bool ok = true;
    for (const Entry &e : entries_) {
        if (!frame_.renameLayer(e.name, e.target)) {
            message(kMsgError, 6, "Could not rename filter result %s to %s", e.name.c_str(),
                    e.target.c_str());
            ok = false;
        }
    }
    // What could not be renamed is removed: no half-named result may stay in the frame.
    if (!ok)
        for (const Entry &e : entries_)
            if (frame_.hasLayer(e.name) && e.name != e.target) frame_.deleteLayer(e.name);
    entries_.clear();
    return ok;
}

void FilterResults::discard() {
    for (const Entry &e : entries_)
        if (frame_.hasLayer(e.name)) frame_.deleteLayer(e.name);
    entries_.clear();
}

// ---------------------------------------------------------------------------------------------

bool PostFilter::filterRows(int32_t y0, int32_t y1, BandScratch &scratch, int32_t &failedX,
                            int32_t &failedY) {
    for (int32_t y = y0; y < y1; ++y) {
        for (int32_t x = 0; x < width_; ++x) {
            if (!filterPixel(x, y)) {
                failedX = x;
                failedY = y;
                return false;
            }
        }
    }
    return true;
}

bool PostFilterCommand::execute(Frame &frame, RenderContext &context, RenderIOInterface &io) {
    // Whatever way this ends before the results are placed (failure, abort, exception), the
    // unfinished results leave the frame.
    struct Discard {
        PostFilter &filter;
        Frame &frame;
        bool armed = true;
        ~Discard() {
            if (armed) filter.discard(frame);
        }
    } guard{*filter_, frame};
    if (!filter_->init(frame, context)) return false;
    filter_->width_ = frame.width();
    io.setProgressTitle("Post Filtering");
    io.setProgress(0.0f);
    const bool concurrent = filter_->concurrentRows();
    RowBands bands(frame.height(), concurrent ? kFilterBandRows : 1, concurrent ? threads_ : 1,
                   &io);
    std::mutex failMutex;
    int32_t failX = -1, failY = -1;
    std::vector<BandScratch> scratch;
    for (int t = 0; t < std::max(threads_, 1); ++t) scratch.emplace_back(frame.scratch());
    const bool ok = bands.run([&](int32_t y0, int32_t y1, int thread) {
        int32_t fx = -1, fy = -1;
        if (filter_->filterRows(y0, y1, scratch[size_t(thread)], fx, fy)) return true;
        std::lock_guard<std::mutex> lock(failMutex);
        // The lowest failing pixel is reported, whatever the thread count.
        if (failY < 0 || fy < failY || (fy == failY && fx < failX)) failX = fx, failY = fy;
        return false;
    });
    if (!ok) {
        if (bands.aborted())
            message(kMsgProgress, 6, "Post filtering aborted");
        else
            message(kMsgError, 6, "Error executing postfilter at pixel (%d, %d)", failX, failY);
        io.finish();
        return false;
    }
    io.finish();
    guard.armed = false;
    return filter_->finish(frame);
}

// ---------------------------------------------------------------------------------------------

bool OutputShaderCommand::execute(Frame &frame, RenderContext &, RenderIOInterface &io) {
    LayerT<Color> *layer = frame.getColorLayer(target_);
    if (!layer) {
        message(kMsgError, 6, "OutputShaderCommand failed: target layer %s not defined",
                target_.c_str());
        return false;
    }
    for (OutputShaderInterface *shader : shaders_)
        if (shader && !shader->shade(*layer, io)) return false;
    return true;
}

}  // namespace ox
