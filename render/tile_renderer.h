#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "core/random.h"
#include "core/render_io.h"
#include "platform/mutex.h"
#include "platform/thread.h"
#include "render/tile.h"

/// The tile loop shared by camera renders, texture bakes and surface transfers: a fixed
/// number of render threads take tiles one by one from one ordered list.
namespace ox {

/// The seed of a run's tile generators unless the run names another (13948116).
constexpr uint64_t kDefaultRunSeed = 0xD4D4D4;

/// What a tile run covers and how it is split.
struct TileRunSettings {
    uint32_t xMin = 0, xMax = 0, yMin = 0, yMax = 0;  ///< inclusive region
    int32_t tileWidth = kDefaultTileSize;             ///< tile edge along x
    int32_t tileHeight = kDefaultTileSize;            ///< tile edge along y
    int32_t scheme = kTileHilbert;                    ///< TileSchemeType
    int32_t threadCount = 1;                          ///< render threads (at least 1)
    uint64_t seed = kDefaultRunSeed;                  ///< seed of the tiles' generators
};

class TileRenderer;

/// One render thread of a tile run ("Renderframe Thread").
class RenderFrameThread final : public OXThread {
public:
    /// The thread with index (from 0) of renderer's run.
    RenderFrameThread(TileRenderer &renderer, int index) : renderer_(renderer), index_(index) {}
    ~RenderFrameThread() override { join(); }
    std::string name() const override { return "Renderframe Thread"; }
    /// The thread's index, from 0.
    int index() const { return index_; }

private:
    void run() override;

    TileRenderer &renderer_;
    int index_;
};

/// The base of every tile-based run kind: implement renderTile (and the optional hooks),
/// then call run.
class TileRenderer {
public:
    TileRenderer();
    virtual ~TileRenderer() = default;
    TileRenderer(const TileRenderer &) = delete;
    TileRenderer &operator=(const TileRenderer &) = delete;

    /// Builds the tile order over the region, calls prepare, starts the threads and joins
    /// them in index order (threadFinished after each), then calls release. Returns false
    /// when the tiles could not be built, prepare failed or a tile failed; an abort through
    /// io stops the threads between tiles and still returns true (ask io.isAborted()).
    bool run(const TileRunSettings &settings, RenderIOInterface &io);

    /// The number of threads of the current or last run.
    int threadCount() const { return threadCount_; }
    /// The tile order of the current run (null outside run).
    const TileInterface *tiles() const { return tiles_.get(); }

protected:
    /// Per-run setup before the threads start (samplers, per-thread state for threadCount
    /// threads); false stops the run (after one message).
    virtual bool prepare(int threadCount) { return true; }
    /// Renders one tile on thread threadIndex; false stops the run (after one message).
    /// Called concurrently from all threads, never with the tile mutex held. Random numbers
    /// come from tileRandom(threadIndex).
    virtual bool renderTile(int threadIndex, const Tile &tile) = 0;
    /// The generator of the tile thread threadIndex is rendering, seeded with the run's seed
    /// and the tile's index just before renderTile: a tile draws the same numbers on any
    /// thread, in any order, with any thread count. Only that thread may use it.
    Random &tileRandom(int threadIndex) { return random_[size_t(threadIndex)].generator; }
    /// Called on the joining thread after thread threadIndex ended, in index order: merge
    /// that thread's statistics here.
    virtual void threadFinished(int threadIndex) {}
    /// Per-run clean-up after all threads ended.
    virtual void release() {}

private:
    friend class RenderFrameThread;
    /// The loop of one render thread.
    void renderThread(int threadIndex);

    std::unique_ptr<OXMutex> tileMutex_;  // guards tiles_ hand-out and progress reports
    std::unique_ptr<TileInterface> tiles_;
    // One generator per thread, each on its own cache lines.
    struct alignas(64) ThreadRandom {
        Random generator;
    };
    std::vector<ThreadRandom> random_;
    uint64_t seed_ = kDefaultRunSeed;
    RenderIOInterface *io_ = nullptr;
    int threadCount_ = 0;
    std::atomic<bool> failed_{false};
};

}  // namespace ox
