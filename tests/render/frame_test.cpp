#include "render/frame.h"

#include <gtest/gtest.h>

#include <cstring>
#include <functional>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "render/layer_cache.h"
#include "tests/support/test_support.h"

namespace {

using ox::Color;
using ox::Region;

using oxtest::contains;

/// A colour that encodes its pixel, so that any misplaced copy shows.
Color code(int x, int y, float tag = 0.0f) { return Color(float(x), float(y), tag, 1.0f); }

/// Every kind of colour storage, made fresh for each case.
std::vector<std::pair<std::string, std::function<std::unique_ptr<ox::LayerT<Color>>(int, int)>>>
colorLayers() {
    return {
        {"linear",
         [](int w, int h) { return std::make_unique<ox::LinearMemoryLayerT<Color>>("c", w, h); }},
        {"tiled 64",
         [](int w, int h) { return std::make_unique<ox::TiledMemoryLayerT<Color>>("c", w, h); }},
        {"tiled 5x3",
         [](int w, int h) {
             return std::make_unique<ox::TiledMemoryLayerT<Color>>("c", w, h, 5, 3);
         }},
        {"spilled linear",
         [](int w, int h) {
             return std::make_unique<ox::LinearMemoryLayerT<Color>>("c", w, h, 0);
         }},
        {"spilled tiled",
         [](int w, int h) {
             return std::make_unique<ox::TiledMemoryLayerT<Color>>("c", w, h, 8, 8, 0);
         }},
    };
}

TEST(LayerTest, PasteReadStrideZeroFillAndRefusedRegions) {
    for (auto &[kind, make] : colorLayers()) {
        SCOPED_TRACE(kind);
        auto layer = make(100, 70);
        // New storage is zero everywhere.
        std::vector<Color> all(100 * 70, code(1, 1));
        ASSERT_TRUE(layer->read(Region(0, 0, 100, 70), all.data()));
        for (const Color &c : all) ASSERT_EQ(c, Color::black());

        // A region pasted from a wider buffer (stride 50), another with stride -1.
        std::vector<Color> src(50 * 20);
        for (int y = 0; y < 20; ++y)
            for (int x = 0; x < 50; ++x) src[y * 50 + x] = code(x + 3, y + 60);
        ASSERT_TRUE(layer->paste(Region(3, 60, 40, 70), src.data(), 50));
        std::vector<Color> small{code(99, 0), code(99, 1)};
        ASSERT_TRUE(layer->paste(Region(99, 0, 100, 2), small.data(), -1));

        std::vector<Color> back(100 * 70);
        ASSERT_TRUE(layer->read(Region(0, 0, 100, 70), back.data()));
        for (int y = 0; y < 70; ++y)
            for (int x = 0; x < 100; ++x) {
                const bool inA = x >= 3 && x < 40 && y >= 60;
                const bool inB = x == 99 && y < 2;
                ASSERT_EQ(back[y * 100 + x], inA || inB ? code(x, y) : Color::black())
                    << x << "," << y;
            }
        // Reading into a wider buffer leaves the gaps alone.
        std::vector<Color> wide(2 * 7, code(-1, -1));
        ASSERT_TRUE(layer->read(Region(38, 62, 40, 64), wide.data(), 7));
        EXPECT_EQ(wide[0], code(38, 62));
        EXPECT_EQ(wide[7 + 1], code(39, 63));
        EXPECT_EQ(wide[2], code(-1, -1));

        // Regions outside the layer, invalid ones and short strides are refused and write
        // nothing.
        const std::vector<Color> big(200 * 200, code(7, 7, 7));
        const std::vector<std::pair<Region, int64_t>> bad = {
            {Region(-1, 0, 5, 5), -1},       {Region(0, 0, 101, 5), -1},
            {Region(0, 65, 5, 71), -1},      {Region(5, 5, 4, 6), -1},
            {Region(0, 0, 5, 5, false), -1}, {Region(0, 0, 10, 2), 9},
            {Region(0, 0, 10, 2), -2},       {Region(2147483600, 0, 2147483647, 1), -1},
        };
        for (auto &[r, stride] : bad) {
            std::string out = oxtest::captureOutput([&, r = r, stride = stride] {
                EXPECT_FALSE(layer->paste(r, big.data(), stride));
                std::vector<Color> sink(200 * 200);
                EXPECT_FALSE(layer->read(r, sink.data(), stride));
            });
            EXPECT_TRUE(contains(out, "[ERROR]")) << out;
        }
        std::vector<Color> again(100 * 70);
        ASSERT_TRUE(layer->read(Region(0, 0, 100, 70), again.data()));
        EXPECT_EQ(again, back);
        // An empty region is a valid no-op.
        EXPECT_TRUE(layer->paste(Region(4, 4, 4, 9), nullptr));
    }
}

TEST(LayerTest, SizesAreCheckedBeforeAnythingIsAllocated) {
    std::string out = oxtest::captureOutput([] {
        ox::LinearMemoryLayerCF cf("cf", 65536, 65536, 1 << 30);
        EXPECT_FALSE(cf.hasStorage());
        float v = 1.0f;
        EXPECT_FALSE(cf.paste(Region(0, 0, 1, 1), &v));
        ox::TiledMemoryLayerT<float> negative("n", -5, 10);
        EXPECT_FALSE(negative.hasStorage());
        ox::TiledMemoryLayerT<float> badTile("t", 10, 10, 0, 64);
        EXPECT_FALSE(badTile.hasStorage());
    });
    EXPECT_TRUE(contains(out, "Failed to initialize linear memory layer")) << out;
    EXPECT_TRUE(contains(out, "Failed to initialize Tiled memory layer")) << out;
    ox::Frame frame(10, 10);
    oxtest::captureOutput([&] {
        EXPECT_FALSE(
            frame.addLayer(std::make_unique<ox::TiledMemoryLayerT<float>>("t", 10, 10, 0, 0)));
    });
    EXPECT_FALSE(frame.hasLayer("t"));
}

TEST(LayerTest, HugeColourLayerSpillsToAFile) {
    // 16384 x 16384 colours are 4 GiB: beyond plain memory, in a spill file.
    constexpr int kSize = 16384;
    ox::TiledMemoryLayerT<Color> layer("beauty", kSize, kSize);
    ASSERT_TRUE(layer.hasStorage());
    EXPECT_TRUE(layer.isFileBacked());
    const Color corner(1, 2, 3, 4);
    ASSERT_TRUE(layer.paste(Region(kSize - 1, kSize - 1, kSize, kSize), &corner));
    ASSERT_TRUE(layer.paste(Region(0, 0, 1, 1), &corner));
    // Enough other tiles to evict the corners from the cache.
    std::vector<Color> tile(64 * 64, Color(5, 5, 5, 5));
    for (int i = 0; i < 40; ++i)
        ASSERT_TRUE(layer.paste(Region(64 * (i + 1), 64 * 8, 64 * (i + 2), 64 * 9), tile.data()));
    Color c;
    ASSERT_TRUE(layer.read(Region(kSize - 1, kSize - 1, kSize, kSize), &c));
    EXPECT_EQ(c, corner);
    ASSERT_TRUE(layer.read(Region(0, 0, 1, 1), &c));
    EXPECT_EQ(c, corner);
    ASSERT_TRUE(layer.read(Region(kSize / 2, kSize / 3, kSize / 2 + 1, kSize / 3 + 1), &c));
    EXPECT_EQ(c, Color::black());
}

TEST(TileCacheTest, WholeTilesAreNotReadAndTheOldestUnpinnedTileIsEvicted) {
    ox::TiledMemoryLayerT<float> layer("Z", 64 * 31, 128);
    const auto &cache = *layer.cache();
    std::vector<float> tile(64 * 64);
    // A paste of a whole tile that is not cached goes straight to storage, as do reads.
    for (int i = 0; i < 31; ++i) {
        for (float &v : tile) v = float(i + 1);
        ASSERT_TRUE(layer.paste(Region(64 * i, 0, 64 * (i + 1), 64), tile.data()));
    }
    std::vector<float> back(64 * 64);
    ASSERT_TRUE(layer.read(Region(64, 0, 128, 64), back.data()));
    for (float v : back) ASSERT_EQ(v, 2.0f);
    EXPECT_EQ(cache.bufferCount(), 0u);
    EXPECT_EQ(cache.storageReads(), 0u);
    EXPECT_EQ(cache.storageWrites(), 0u);
    // A paste of part of a tile loads it; the 31st such tile evicts the first, written back.
    for (int i = 0; i < 31; ++i) {
        for (float &v : tile) v = float(i + 100);
        ASSERT_TRUE(layer.paste(Region(64 * i, 0, 64 * i + 63, 64), tile.data(), 64));
    }
    EXPECT_EQ(cache.storageReads(), 31u);
    EXPECT_EQ(cache.bufferCount(), ox::TileStorageCacheT<float>::kCapacity);
    EXPECT_EQ(cache.storageWrites(), 1u);
    // A whole-tile paste into a cached tile goes through the cache; reads see both paths.
    for (float &v : tile) v = 7.0f;
    ASSERT_TRUE(layer.paste(Region(64 * 30, 0, 64 * 31, 64), tile.data()));
    EXPECT_EQ(cache.storageReads(), 31u);
    for (int i : {0, 1, 30}) {
        ASSERT_TRUE(layer.read(Region(64 * i, 0, 64 * (i + 1), 64), back.data()));
        for (int y = 0; y < 64; ++y)
            for (int x = 0; x < 64; ++x) {
                const float want = i == 30 ? 7.0f : x == 63 ? float(i + 1) : float(i + 100);
                ASSERT_EQ(back[size_t(y * 64 + x)], want) << i << " " << x << " " << y;
            }
    }
}

TEST(TileCacheTest, PinnedTilesAreNeverEvictedAndTheCacheGrows) {
    ox::MMFileTiledStorageT<float> storage(64 * 40, 1, 64, 1);
    ox::TileStorageCacheT<float> cache(storage);
    std::vector<float *> pinned;
    for (uint32_t i = 0; i < 30; ++i) {
        pinned.push_back(cache.acquire(i, 0, true));
        pinned.back()[0] = float(i) + 100;
    }
    // Every buffer is pinned: the cache grows instead of evicting or waiting.
    float *extra = cache.acquire(30, 0, true);
    EXPECT_EQ(cache.bufferCount(), 31u);
    EXPECT_EQ(cache.storageWrites(), 0u);
    for (uint32_t i = 0; i < 30; ++i) EXPECT_EQ(pinned[i][0], float(i) + 100);
    cache.release(30, 0);
    // Releasing tile 5 makes it the only candidate, though it is not the oldest.
    cache.release(5, 0);
    float *next = cache.acquire(31, 0, true);
    EXPECT_EQ(next, pinned[5]);
    EXPECT_EQ(cache.storageWrites(), 1u);
    std::vector<float> written(64);
    storage.readTile(5, 0, written.data());
    EXPECT_EQ(written[0], 105.0f);
    (void)extra;
}

TEST(TileCacheTest, OnlyWrittenTilesAreWrittenBack) {
    ox::MMFileTiledStorageT<float> storage(64 * 40, 1, 64, 1);
    ox::TileStorageCacheT<float> cache(storage);
    // Thirty tiles only read, then evicted by ten more: storage is never written.
    for (uint32_t i = 0; i < 30; ++i) {
        cache.acquire(i, 0, true, false)[0] = float(i) + 1;  // a stray write stays unseen
        cache.release(i, 0);
    }
    for (uint32_t i = 30; i < 40; ++i) {
        cache.acquire(i, 0, true, false);
        cache.release(i, 0);
    }
    EXPECT_EQ(cache.storageWrites(), 0u);
    std::vector<float> tile(64);
    storage.readTile(3, 0, tile.data());
    EXPECT_EQ(tile[0], 0.0f);
    // A tile read and then written by another acquirer is written back once, on flush.
    cache.acquire(35, 0, true, false);
    cache.acquire(35, 0, true)[1] = 5.0f;
    cache.release(35, 0);
    cache.release(35, 0);
    cache.flush();
    cache.flush();
    EXPECT_EQ(cache.storageWrites(), 1u);
    storage.readTile(35, 0, tile.data());
    EXPECT_EQ(tile[1], 5.0f);
}

TEST(TileCacheTest, TileKeysBeyondSixteenBits) {
    ox::TiledMemoryLayerT<bool> layer("mask", 70000, 2, 1, 1);
    const bool yes = true;
    ASSERT_TRUE(layer.paste(Region(69999, 1, 70000, 2), &yes));
    // Tile 69999 - 65536 must stay a different tile, also after eviction.
    for (int i = 0; i < 40; ++i) {
        bool f = false;
        ASSERT_TRUE(layer.paste(Region(100 + i, 0, 101 + i, 1), &f));
    }
    bool a = false, b = true;
    ASSERT_TRUE(layer.read(Region(69999, 1, 70000, 2), &a));
    ASSERT_TRUE(layer.read(Region(69999 - 65536, 1, 69999 - 65535, 2), &b));
    EXPECT_TRUE(a);
    EXPECT_FALSE(b);
}

// Many threads paste disjoint regions that share tiles into one tiled layer, with more tiles
// than the cache holds; no pixel may be lost or mixed. Run under ThreadSanitizer by make tsan.
TEST(TileCacheTest, ConcurrentDisjointPastesLoseNoPixel) {
    static constexpr int kW = 611, kH = 389, kThreads = 8, kCell = 13;
    ox::TiledMemoryLayerT<Color> layer("beauty", kW, kH, 32, 32);
    ox::TiledMemoryLayerT<Color> &shared = layer;
    std::vector<std::thread> threads;
    for (int t = 0; t < kThreads; ++t)
        threads.emplace_back([&shared, t] {
            std::vector<Color> cell(kCell * kCell);
            int n = 0;
            for (int y0 = 0; y0 < kH; y0 += kCell)
                for (int x0 = 0; x0 < kW; x0 += kCell, ++n) {
                    if (n % kThreads != t) continue;
                    const Region r(x0, y0, std::min(x0 + kCell, kW), std::min(y0 + kCell, kH));
                    for (int y = r.yMin; y < r.yMax; ++y)
                        for (int x = r.xMin; x < r.xMax; ++x)
                            cell[(y - y0) * r.width() + (x - x0)] = code(x, y, float(t));
                    ASSERT_TRUE(shared.paste(r, cell.data()));
                    // Read back at once, while other threads evict around this one.
                    std::vector<Color> back(cell.size());
                    ASSERT_TRUE(shared.read(r, back.data()));
                    for (int64_t i = 0; i < r.area(); ++i) ASSERT_EQ(back[i], cell[i]);
                }
        });
    for (auto &th : threads) th.join();
    std::vector<Color> all(kW * kH);
    ASSERT_TRUE(layer.read(Region(0, 0, kW, kH), all.data()));
    for (int y = 0; y < kH; ++y)
        for (int x = 0; x < kW; ++x) {
            const int n = (y / kCell) * ((kW + kCell - 1) / kCell) + x / kCell;
            ASSERT_EQ(all[y * kW + x], code(x, y, float(n % kThreads))) << x << "," << y;
        }
}

/// Records what it is told.
class RecordingObserver : public ox::LayerObserver {
public:
    std::string observedLayer() const override { return "beauty"; }
    void notify(const Region &r, const Color *data, int64_t stride,
                const std::string &name) override {
        regions.push_back(r);
        first = data[0];
        names.push_back(name);
    }
    void synchronize(ox::LayerT<Color> &) override { ++syncs; }
    std::vector<Region> regions;
    std::vector<std::string> names;
    Color first;
    int syncs = 0;
};

TEST(FrameTest, LayerManagementAndItsMessages) {
    ox::Frame frame(10, 6);
    ASSERT_NE(frame.addTiledLayer<Color>("beauty"), nullptr);
    ASSERT_NE(frame.addTiledLayer<float>("Z"), nullptr);
    ASSERT_NE(frame.addCustomFloatLayer("irr", 6), nullptr);
    EXPECT_EQ(frame.layerNames(), (std::vector<std::string>{"Z", "beauty", "irr"}));
    EXPECT_NE(frame.getColorLayer("beauty"), nullptr);
    EXPECT_EQ(frame.getFloatLayer("beauty"), nullptr);
    EXPECT_EQ(frame.getCFLayer("Z"), nullptr);
    EXPECT_NE(frame.getCFLayer("irr"), nullptr);
    EXPECT_EQ(frame.getBoolLayer("nope"), nullptr);

    const std::vector<float> f(60, 2.0f);
    struct Case {
        std::function<bool()> call;
        const char *text;
    };
    const std::vector<Case> cases = {
        {[&] { return frame.pasteRegion<float>("beauty", Region(0, 0, 2, 2), f.data()); },
         "Pasting region of incorrect type in layer beauty"},
        {[&] { return frame.pasteRegion<float>("gone", Region(0, 0, 2, 2), f.data()); },
         "Pasting in non existing layer gone"},
        {[&] {
             std::vector<float> d(4);
             return frame.readRegion<float>("irr", Region(0, 0, 2, 2), d.data());
         },
         "Reading region from incorrect type in layer irr"},
        {[&] {
             std::vector<Color> d(4);
             return frame.readRegion<Color>("gone", Region(0, 0, 2, 2), d.data());
         },
         "Reading region from non existing layer gone"},
        {[&] { return frame.deleteLayer("gone"); }, "Deleting non existing layer gone"},
        {[&] { return frame.detachLayer("gone") != nullptr; }, "Detaching non existing layer gone"},
        {[&] { return frame.flushLayer("gone"); }, "Flüshing non existing layer gone"},
        {[&] { return frame.addTiledLayer<Color>("Z") != nullptr; }, "Layer Z already exists"},
        {[&] { return frame.addLayer(std::make_unique<ox::TiledMemoryLayerT<float>>("x", 9, 6)); },
         "does not fit the frame"},
        {[&] { return frame.renameLayer("Z", "irr"); }, "Layer irr already exists"},
    };
    for (const Case &c : cases) {
        bool ok = true;
        std::string out = oxtest::captureOutput([&] { ok = c.call(); });
        EXPECT_FALSE(ok) << c.text;
        EXPECT_TRUE(contains(out, std::string("[ERROR]")) && contains(out, c.text)) << out;
    }
    // The refused float paste left the colour layer unchanged.
    Color c(9, 9, 9, 9);
    ASSERT_TRUE(frame.readRegion<Color>("beauty", Region(1, 1, 2, 2), &c));
    EXPECT_EQ(c, Color::black());

    std::vector<float> cf(6, 3.0f);
    EXPECT_TRUE(frame.pasteCFRegion("irr", Region(9, 5, 10, 6), cf.data()));
    ASSERT_TRUE(frame.renameLayer("irr", "irr2"));
    std::vector<float> cfBack(6);
    EXPECT_TRUE(frame.readCFRegion("irr2", Region(9, 5, 10, 6), cfBack.data()));
    EXPECT_EQ(cfBack, cf);
    EXPECT_EQ(frame.getLayer("irr2")->name(), "irr2");
    std::unique_ptr<ox::Layer> z = frame.detachLayer("Z");
    ASSERT_NE(z, nullptr);
    EXPECT_FALSE(frame.hasLayer("Z"));
    EXPECT_TRUE(frame.deleteLayer("irr2"));
    EXPECT_EQ(frame.layerNames(), (std::vector<std::string>{"beauty"}));
}

TEST(FrameTest, ObserversAreNotifiedOncePerPaste) {
    ox::Frame frame(8, 8);
    frame.addTiledLayer<Color>("beauty");
    RecordingObserver obs;
    std::string out = oxtest::captureOutput([&] {
        EXPECT_TRUE(frame.registerObserver("beauty", &obs));
        EXPECT_TRUE(frame.registerObserver("beauty", &obs));
    });
    EXPECT_TRUE(contains(out, "Layer observer double registred for layer beauty")) << out;
    EXPECT_EQ(frame.getLayer("beauty")->observers().size(), 1u);
    const Color px[2] = {Color(1, 2, 3), Color(4, 5, 6)};
    ASSERT_TRUE(frame.pasteRegion<Color>("beauty", Region(2, 3, 4, 4), px));
    ASSERT_EQ(obs.regions.size(), 1u);
    EXPECT_EQ(obs.regions[0], Region(2, 3, 4, 4));
    EXPECT_EQ(obs.names[0], "beauty");
    EXPECT_EQ(obs.first, px[0]);
    EXPECT_TRUE(frame.flushLayer("beauty"));
    EXPECT_EQ(obs.syncs, 1);
    frame.unregisterObserver("beauty", &obs);
    out = oxtest::captureOutput([&] { frame.unregisterObserver("beauty", &obs); });
    EXPECT_TRUE(contains(out, "Deleted layer observer didn't exist in layer beauty")) << out;
    ASSERT_TRUE(frame.pasteRegion<Color>("beauty", Region(2, 3, 4, 4), px));
    EXPECT_EQ(obs.regions.size(), 1u);

    // An observer without its own notify reports the default text.
    class Bare : public ox::LayerObserver {
        std::string observedLayer() const override { return "Z"; }
    } bare;
    frame.addTiledLayer<float>("Z");
    frame.registerObserver("Z", &bare);
    const float z = 1.0f;
    out = oxtest::captureOutput([&] { frame.pasteRegion<float>("Z", Region(0, 0, 1, 1), &z); });
    EXPECT_TRUE(contains(out, "Non implemented notify called")) << out;
    // Deleting the layer drops its registrations along with it.
    EXPECT_TRUE(frame.deleteLayer("Z"));
}

TEST(FrameTest, RetiredStorageServesTheNextScratchLayerOnly) {
    ox::Frame frame(100, 70);
    ox::LayerT<Color> *beauty = frame.addTiledLayer<Color>("beauty");
    std::vector<Color> all(100 * 70);
    for (int y = 0; y < 70; ++y)
        for (int x = 0; x < 100; ++x) all[size_t(y * 100 + x)] = code(x, y, 7);
    ASSERT_TRUE(beauty->paste(Region(0, 0, 100, 70), all.data()));
    RecordingObserver obs;
    ASSERT_TRUE(frame.registerObserver("beauty", &obs));
    // Other kinds and tile sizes are destroyed like deleted layers.
    frame.addTiledLayer<float>("Z");
    frame.addTiledLayer<Color>("small tiles", 8);
    EXPECT_TRUE(frame.retireLayer("Z"));
    EXPECT_TRUE(frame.retireLayer("small tiles"));
    EXPECT_EQ(frame.retiredLayerCount(), 0u);
    EXPECT_TRUE(frame.retireLayer("beauty"));
    EXPECT_FALSE(frame.hasLayer("beauty"));
    EXPECT_EQ(frame.retiredLayerCount(), 1u);

    // The scratch layer is the retired one under its new name, without the old observers;
    // a second scratch layer, or a plain tiled one, is fresh and zero-filled.
    ox::LayerT<Color> *scratch = frame.addScratchColorLayer("temp");
    EXPECT_EQ(scratch, beauty);
    EXPECT_EQ(frame.getColorLayer("temp"), scratch);
    EXPECT_EQ(scratch->name(), "temp");
    EXPECT_TRUE(scratch->observers().empty());
    EXPECT_EQ(frame.retiredLayerCount(), 0u);
    ox::LayerT<Color> *fresh = frame.addScratchColorLayer("temp1");
    ASSERT_NE(fresh, nullptr);
    std::vector<Color> back(100 * 70);
    ASSERT_TRUE(fresh->read(Region(0, 0, 100, 70), back.data()));
    for (const Color &c : back) ASSERT_EQ(c, Color(0, 0, 0, 0));
    // Pasting the whole scratch layer leaves nothing of its former contents.
    for (Color &c : all) c.b = 9;
    ASSERT_TRUE(scratch->paste(Region(0, 0, 100, 70), all.data()));
    ASSERT_TRUE(scratch->read(Region(0, 0, 100, 70), back.data()));
    EXPECT_EQ(back, all);
    EXPECT_TRUE(obs.regions.empty());
    // A taken name is refused as for any new layer.
    std::string out =
        oxtest::captureOutput([&] { EXPECT_EQ(frame.addScratchColorLayer("temp"), nullptr); });
    EXPECT_TRUE(contains(out, "Layer temp already exists in the frame")) << out;
    frame.retireLayer("temp1");
    frame.releaseRetiredLayers();
    EXPECT_EQ(frame.retiredLayerCount(), 0u);
}

TEST(ScratchPoolTest, BlocksOfEverySizeAreAlignedWholeAndReused) {
    ox::ScratchPool pool;
    // Below, at and above a huge page: aligned, usable to the last byte, given back on reset.
    for (size_t bytes : {size_t(100), size_t(2) << 20, (size_t(5) << 20) + 3}) {
        void *first = nullptr;
        {
            ox::ScratchBlock block = pool.borrow(bytes);
            ASSERT_NE(block.as<char>(), nullptr) << bytes;
            EXPECT_GE(block.bytes(), bytes);
            EXPECT_EQ(reinterpret_cast<uintptr_t>(block.as<char>()) % 64, 0u);
            std::memset(block.as<char>(), 0x5A, block.bytes());
            first = block.as<void>();
        }
        EXPECT_GE(pool.keptBytes(), bytes);
        // The block kept serves the next request of its size, a much smaller one does not.
        ox::ScratchBlock again = pool.borrow(bytes);
        EXPECT_EQ(again.as<void>(), first) << bytes;
        again.reset();
        ox::ScratchBlock tiny = pool.borrow(bytes / 8 + 1);
        EXPECT_NE(tiny.as<void>(), first);
    }
    pool.release();
    EXPECT_EQ(pool.keptBytes(), 0u);
}

TEST(LayerViewTest, ColourAndCustomFloatViews) {
    ox::LinearMemoryLayerCF cf("irr", 3, 2, 2);
    std::vector<float> v(12);
    for (int i = 0; i < 12; ++i) v[i] = float(i);
    ASSERT_TRUE(cf.paste(Region(0, 0, 3, 2), v.data()));

    ox::ColorFromCFLayer view("temp", cf, 0);
    std::vector<Color> c(6);
    ASSERT_TRUE(view.read(Region(0, 0, 3, 2), c.data()));
    EXPECT_EQ(c[4], Color(8, 9, 0, 1));
    std::string out =
        oxtest::captureOutput([&] { EXPECT_FALSE(view.paste(Region(0, 0, 1, 1), c.data())); });
    EXPECT_TRUE(contains(out, "Use ColorFromCFLayerRW instead")) << out;

    // The writable view stores the channels that exist, from offset 1.
    ox::ColorFromCFLayerRW rw("temp", cf, 1);
    const Color in(50, 51, 52, 53);
    ASSERT_TRUE(rw.paste(Region(1, 1, 2, 2), &in));
    float px[2];
    ASSERT_TRUE(cf.read(Region(1, 1, 2, 2), px));
    EXPECT_EQ(px[0], 8.0f);
    EXPECT_EQ(px[1], 50.0f);

    ox::LinearMemoryLayerT<Color> color("beauty", 2, 1);
    const Color two[2] = {Color(1, 2, 3, 4), Color(5, 6, 7, 8)};
    color.paste(Region(0, 0, 2, 1), two);
    ox::CFFromColorLayer asCF("beauty", color);
    float f[8];
    ASSERT_TRUE(asCF.read(Region(0, 0, 2, 1), f));
    EXPECT_EQ(f[5], 6.0f);
    out = oxtest::captureOutput([&] { EXPECT_FALSE(asCF.paste(Region(0, 0, 1, 1), f)); });
    EXPECT_TRUE(contains(out, "CFFromColorLayer.pasteRegion not implemented")) << out;
    EXPECT_TRUE(contains(out, "Use CFFromColorLayerRW instead")) << out;

    ox::TiledMemoryLayerT<float> z("Z", 4, 4);
    ox::CFFromFloatLayerRW zcf("Z", z);
    EXPECT_EQ(zcf.channels(), 1);
    const float minus = -1.0f;
    ASSERT_TRUE(zcf.paste(Region(3, 3, 4, 4), &minus));
    float back = 0.0f;
    ASSERT_TRUE(z.read(Region(3, 3, 4, 4), &back));
    EXPECT_EQ(back, -1.0f);
}

TEST(FrameTest, CropCopiesEveryKind) {
    ox::Frame frame(20, 10);
    auto *beauty = frame.addTiledLayer<Color>("beauty", 4);
    auto *mask = frame.addTiledLayer<bool>("mask");
    auto *irr = frame.addCustomFloatLayer("irr", 3);
    const Color c(1, 2, 3, 4);
    beauty->paste(Region(5, 6, 6, 7), &c);
    const bool t = true;
    mask->paste(Region(7, 8, 8, 9), &t);
    const float f[3] = {7, 8, 9};
    irr->paste(Region(5, 6, 6, 7), f);

    auto cropped = ox::FrameUtils::crop(frame, Region(5, 6, 8, 9), {"beauty", "mask", "irr"});
    ASSERT_NE(cropped, nullptr);
    EXPECT_EQ(cropped->width(), 3);
    EXPECT_EQ(cropped->height(), 3);
    Color cb;
    ASSERT_TRUE(cropped->readRegion<Color>("beauty", Region(0, 0, 1, 1), &cb));
    EXPECT_EQ(cb, c);
    bool tb = false;
    ASSERT_TRUE(cropped->readRegion<bool>("mask", Region(2, 2, 3, 3), &tb));
    EXPECT_TRUE(tb);
    float fb[3];
    ASSERT_TRUE(cropped->readCFRegion("irr", Region(0, 0, 1, 1), fb));
    EXPECT_EQ(fb[2], 9.0f);

    std::string out = oxtest::captureOutput([&] {
        EXPECT_EQ(ox::FrameUtils::crop(frame, Region(0, 0, 2, 2), {"beauty", "no"}), nullptr);
    });
    EXPECT_TRUE(contains(out, "Crop failed, layer no is not present in frame")) << out;
    out = oxtest::captureOutput(
        [&] { EXPECT_EQ(ox::FrameUtils::crop(frame, Region(15, 0, 25, 2), {"beauty"}), nullptr); });
    EXPECT_TRUE(contains(out, "Failed to crop layer beauty in FrameUtils::crop")) << out;
}

TEST(LayerCacheTest, ModesAndWriteBack) {
    ox::TiledMemoryLayerT<Color> layer("beauty", 130, 70);
    const Color seed(1, 1, 1, 1);
    layer.paste(Region(129, 69, 130, 70), &seed);
    {
        // One slot at a time: every move to another slot evicts and writes back.
        ox::LayerCacheGCT<Color, ox::LayerCacheMode::kReadWrite> rw(layer, 1);
        EXPECT_EQ(rw.get(129, 69), seed);
        for (int y = 0; y < 70; ++y)
            for (int x = 0; x < 130; ++x) rw.set(x, y, rw.get(x, y) + code(x, y));
    }
    std::vector<Color> all(130 * 70);
    ASSERT_TRUE(layer.read(Region(0, 0, 130, 70), all.data()));
    EXPECT_EQ(all[5 * 130 + 7], code(7, 5));
    EXPECT_EQ(all[69 * 130 + 129], code(129, 69) + seed);
    {
        ox::LayerCacheGCT<Color, ox::LayerCacheMode::kRead> ro(layer);
        EXPECT_EQ(ro.get(64, 64), code(64, 64));
    }
    {
        ox::LayerCacheGCT<Color, ox::LayerCacheMode::kWrite> wo(layer);
        wo.set(0, 0, seed);
    }
    // The write cache wrote its slot whole: the rest of that slot is zero again.
    Color c;
    layer.read(Region(1, 1, 2, 2), &c);
    EXPECT_EQ(c, Color::black());
    layer.read(Region(0, 0, 1, 1), &c);
    EXPECT_EQ(c, seed);

    ox::LinearMemoryLayerCF cf("irr", 70, 3, 5);
    {
        ox::LayerCacheGCCFT<ox::LayerCacheMode::kReadWrite> cache(cf);
        cache.at(69, 2)[4] = 42.0f;
        EXPECT_TRUE(cache.flush());
    }
    float px[5];
    cf.read(Region(69, 2, 70, 3), px);
    EXPECT_EQ(px[4], 42.0f);
}

}  // namespace
