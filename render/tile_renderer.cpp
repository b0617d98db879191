#include "render/tile_renderer.h"

#include <algorithm>

#include "core/message.h"

namespace ox {

void RenderFrameThread::run() { renderer_.renderThread(index_); }

TileRenderer::TileRenderer() : tileMutex_(createMutex(true, true)) {}

bool TileRenderer::run(const TileRunSettings &settings, RenderIOInterface &io) {
    io_ = &io;
    failed_.store(false);
    tiles_ = createTileOrder(settings.scheme);
    bool ok = tiles_->build(settings.xMin, settings.xMax, settings.yMin, settings.yMax,
                            settings.tileWidth, settings.tileHeight);
    // More threads than tiles would only start threads that find nothing to do.
    threadCount_ = std::clamp(settings.threadCount, 1, std::max(1, tiles_->count()));
    seed_ = settings.seed;
    random_.assign(size_t(threadCount_), ThreadRandom());
    if (ok) ok = prepare(threadCount_);
    if (ok && tiles_->count() > 0) {
        std::vector<std::unique_ptr<RenderFrameThread>> threads;
        threads.reserve(size_t(threadCount_));
        for (int i = 0; i < threadCount_; ++i) {
            threads.push_back(std::make_unique<RenderFrameThread>(*this, i));
            if (!threads.back()->start()) {
                // The threads already running finish the list alone.
                threads.pop_back();
                break;
            }
        }
        if (threads.empty()) failed_.store(true);
        for (auto &thread : threads) {
            thread->join();
            threadFinished(thread->index());
            thread.reset();
        }
        ok = !failed_.load();
    }
    release();
    tiles_.reset();
    io_ = nullptr;
    return ok;
}

void TileRenderer::renderThread(int threadIndex) {
    Tile tile;
    bool rendered = false;  // a tile was rendered and is not yet counted
    for (;;) {
        bool have = false;
        {
            // One visit to the tile mutex per tile: count the finished tile, report progress
            // (under the mutex, so io sees values that never go down) and take the next one.
            OXScopedLock<OXMutex> lock(*tileMutex_);
            if (rendered) {
                tiles_->markFinished();
                io_->setProgress(tiles_->progress());
            }
            // Aborts and failures take effect between tiles, never inside one. The test comes
            // after the report, under the mutex, so an abort raised by any report (this one
            // included) stops every later hand-out.
            const bool stop = io_->isAborted() || failed_.load(std::memory_order_relaxed);
            if (!stop) have = tiles_->nextTile(tile);
        }
        if (!have) return;
        random_[size_t(threadIndex)].generator.seed(streamSeed(seed_, tile.index));
        rendered = renderTile(threadIndex, tile);
        if (!rendered) {
            failed_.store(true);
            return;
        }
    }
}

}  // namespace ox
