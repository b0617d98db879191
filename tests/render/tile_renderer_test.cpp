#include "render/tile_renderer.h"

#include <gtest/gtest.h>

#include <atomic>
#include <cstdint>
#include <thread>
#include <vector>

#include "tests/render/fake_io.h"

namespace {

/// Counts how often each pixel is rendered; fails on a chosen tile.
class CountingRenderer : public ox::TileRenderer {
public:
    CountingRenderer(int w, int h, int failAt = -1)
        : w_(w), pixels_(size_t(w) * size_t(h)), failAt_(failAt) {}

    std::vector<std::atomic<int>> &pixels() { return pixels_; }
    std::atomic<int> tilesRendered{0};
    std::vector<int> finishedOrder;
    int prepared = 0;
    bool released = false;
    std::vector<int> tilesPerThread;

protected:
    bool prepare(int threadCount) override {
        prepared = threadCount;
        tilesPerThread.assign(size_t(threadCount), 0);
        return true;
    }
    bool renderTile(int thread, const ox::Tile &tile) override {
        int n = tilesRendered.fetch_add(1);
        if (n == failAt_) return false;
        for (uint32_t y = tile.yMin; y <= tile.yMax; ++y)
            for (uint32_t x = tile.xMin; x <= tile.xMax; ++x)
                pixels_[size_t(y) * size_t(w_) + x].fetch_add(1);
        ++tilesPerThread.at(size_t(thread));  // each thread owns its slot
        std::this_thread::yield();
        return true;
    }
    void threadFinished(int thread) override { finishedOrder.push_back(thread); }
    void release() override { released = true; }

private:
    int w_;
    std::vector<std::atomic<int>> pixels_;
    int failAt_;
};

/// Fills every pixel with bytes drawn from the tile's generator, pixels in row order.
class NoiseRenderer : public ox::TileRenderer {
public:
    NoiseRenderer(int w, int h) : w_(w), bytes_(size_t(w) * size_t(h) * 3) {}
    const std::vector<uint8_t> &bytes() const { return bytes_; }

protected:
    bool renderTile(int thread, const ox::Tile &tile) override {
        ox::Random &random = tileRandom(thread);
        for (uint32_t y = tile.yMin; y <= tile.yMax; ++y)
            for (uint32_t x = tile.xMin; x <= tile.xMax; ++x)
                for (int c = 0; c < 3; ++c)
                    bytes_[(size_t(y) * size_t(w_) + x) * 3 + size_t(c)] =
                        uint8_t(random.nextIndex(256));
        std::this_thread::yield();  // let the other thread take tiles meanwhile
        return true;
    }

private:
    int w_;
    std::vector<uint8_t> bytes_;  // each tile writes only its own pixels
};

ox::TileRunSettings settingsFor(int w, int h, int tile, int scheme, int threads) {
    ox::TileRunSettings s;
    s.xMin = 0, s.xMax = uint32_t(w - 1), s.yMin = 0, s.yMax = uint32_t(h - 1);
    s.tileWidth = s.tileHeight = tile;
    s.scheme = scheme;
    s.threadCount = threads;
    return s;
}

TEST(TileRendererTest, EveryPixelOnceWithMoreThreadsThanCores) {
    for (int scheme = 0; scheme < 4; ++scheme) {
        CountingRenderer r(61, 47);
        oxtest::FakeIO io;
        ASSERT_TRUE(r.run(settingsFor(61, 47, 4, scheme, 8), io));
        EXPECT_EQ(r.prepared, 8);
        EXPECT_TRUE(r.released);
        for (auto &p : r.pixels()) ASSERT_EQ(p.load(), 1) << "scheme " << scheme;
        EXPECT_EQ(r.finishedOrder, (std::vector<int>{0, 1, 2, 3, 4, 5, 6, 7}));
        // Progress reports never go down and end at 1.
        ASSERT_EQ(io.progress.size(), size_t(16 * 12));
        for (size_t i = 1; i < io.progress.size(); ++i)
            ASSERT_GT(io.progress[i], io.progress[i - 1]);
        EXPECT_EQ(io.progress.back(), 1.0f);
        EXPECT_EQ(r.tiles(), nullptr);
    }
}

TEST(TileRendererTest, AbortAndFailingTileStopTheRun) {
    CountingRenderer r(64, 64);
    oxtest::FakeIO io;
    io.abortAfter = 10;
    ASSERT_TRUE(r.run(settingsFor(64, 64, 4, ox::kTileHilbert, 6), io));
    EXPECT_TRUE(io.isAborted());
    // Threads that already held a tile finish it; nobody takes a new one.
    EXPECT_GE(r.tilesRendered.load(), 10);
    EXPECT_LE(r.tilesRendered.load(), 10 + 5);
    int rendered = 0;
    for (auto &p : r.pixels()) {
        ASSERT_LE(p.load(), 1);
        rendered += p.load();
    }
    EXPECT_EQ(rendered, r.tilesRendered.load() * 16);

    CountingRenderer failing(64, 64, 5);
    oxtest::FakeIO quiet;
    EXPECT_FALSE(failing.run(settingsFor(64, 64, 4, ox::kTileRandom, 4), quiet));
    EXPECT_LT(failing.tilesRendered.load(), 256);
    EXPECT_TRUE(failing.released);
    EXPECT_EQ(failing.finishedOrder.size(), 4u);
}

TEST(TileRendererTest, FewTilesAndNoTiles) {
    CountingRenderer r(8, 8);
    oxtest::FakeIO io;
    ASSERT_TRUE(r.run(settingsFor(8, 8, 32, ox::kTileConcentric, 16), io));
    EXPECT_EQ(r.threadCount(), 1);  // one tile needs one thread
    EXPECT_EQ(r.pixels()[63].load(), 1);

    CountingRenderer empty(1, 1);
    ox::TileRunSettings s = settingsFor(1, 1, 32, 0, 4);
    s.xMin = 5;  // xMax < xMin
    ASSERT_TRUE(empty.run(s, io));
    EXPECT_EQ(empty.tilesRendered.load(), 0);
    EXPECT_TRUE(empty.released);
}

TEST(TileRendererTest, TileRandomNumbersDependOnTheSeedAndTileOnly) {
    // 45 x 37 pixels in tiles of 8: a ragged last column and row.
    auto render = [](int scheme, int threads, uint64_t seed) {
        NoiseRenderer r(45, 37);
        oxtest::FakeIO io;
        ox::TileRunSettings s = settingsFor(45, 37, 8, scheme, threads);
        s.seed = seed;
        EXPECT_TRUE(r.run(s, io));
        return r.bytes();
    };
    const std::vector<uint8_t> reference = render(ox::kTileLeftToRight, 1, ox::kDefaultRunSeed);
    for (int scheme : {ox::kTileHilbert, ox::kTileConcentric, ox::kTileRandom})
        for (int threads : {1, 2}) {
            SCOPED_TRACE(::testing::Message() << "scheme " << scheme << " threads " << threads);
            EXPECT_TRUE(render(scheme, threads, ox::kDefaultRunSeed) == reference);
        }
    EXPECT_FALSE(render(ox::kTileLeftToRight, 2, 7) == reference);

    // Tile (1, 0) starts with the system generator seeded from the run seed and its index 1,
    // and differs from tile 0.
    ox::Random tile1(ox::streamSeed(ox::kDefaultRunSeed, 1)),
        tile0(ox::streamSeed(ox::kDefaultRunSeed, 0));
    uint8_t first1 = uint8_t(tile1.nextIndex(256)), first0 = uint8_t(tile0.nextIndex(256));
    EXPECT_EQ(reference[8 * 3], first1);
    EXPECT_EQ(reference[0], first0);
    EXPECT_NE(std::vector<uint8_t>(reference.begin(), reference.begin() + 24),
              std::vector<uint8_t>(reference.begin() + 24, reference.begin() + 48));
}

}  // namespace
