#include "render/tile.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <set>
#include <utility>
#include <vector>

namespace {

using Grid = std::vector<std::pair<int64_t, int64_t>>;

/// The hand-out order as (column, row) of a tile-size-1 build over nx x ny.
Grid orderOf(ox::TileInterface &t, int64_t nx, int64_t ny) {
    EXPECT_TRUE(t.build(0, uint32_t(nx - 1), 0, uint32_t(ny - 1), 1, 1));
    Grid g;
    for (const ox::Tile &tile : t.tiles()) g.emplace_back(tile.xMin, tile.yMin);
    return g;
}

/// The textbook Hilbert curve over the smallest power-of-two square holding the grid, walked
/// point by point without skipping, filtered to the grid.
Grid naiveHilbert(int64_t nx, int64_t ny) {
    int64_t side = 1;
    while (side < std::max(nx, ny)) side *= 2;
    Grid out;
    for (int64_t d = 0; d < side * side; ++d) {
        int64_t x = 0, y = 0, t = d;
        for (int64_t s = 1; s < side; s *= 2, t /= 4) {
            const int64_t rx = 1 & (t / 2), ry = 1 & (t ^ rx);
            if (ry == 0) {
                if (rx == 1) x = s - 1 - x, y = s - 1 - y;
                std::swap(x, y);
            }
            x += s * rx;
            y += s * ry;
        }
        if (x < nx && y < ny) out.emplace_back(x, y);
    }
    return out;
}

TEST(TileTest, RegionSplitting) {
    ox::LRBTTile t;
    ASSERT_TRUE(t.build(7, 7, 9, 9, 32, 32));  // a 1 x 1 region
    ASSERT_EQ(t.count(), 1);
    EXPECT_EQ(t.tiles()[0], (ox::Tile{7, 7, 9, 9, true}));

    ASSERT_TRUE(t.build(0, 99, 0, 49, 32, 32));                   // 100 x 50
    EXPECT_EQ(t.tiles()[3], (ox::Tile{96, 99, 0, 31, true, 3}));  // right column 4 wide
    EXPECT_EQ(t.tiles()[4], (ox::Tile{0, 31, 32, 49, true, 4}));  // top row 18 high

    // Bounds at the top of the 32-bit range do not wrap.
    ASSERT_TRUE(t.build(UINT32_MAX - 40, UINT32_MAX, 0, 0, 32, 1));
    ASSERT_EQ(t.count(), 2);
    EXPECT_EQ(t.tiles()[1].xMax, UINT32_MAX);

    ASSERT_TRUE(t.build(10, 9, 0, 5, 32, 32));  // empty
    EXPECT_EQ(t.count(), 0);
    EXPECT_TRUE(t.isDone());
    EXPECT_EQ(t.progress(), 1.0f);

    testing::internal::CaptureStdout();
    ASSERT_TRUE(t.build(0, 99, 0, 49, 0, -5));
    std::string out = testing::internal::GetCapturedStdout();
    EXPECT_NE(out.find("[WARNING]  Tile size 0 x -5 is below 1, using 32"), std::string::npos);
    EXPECT_EQ(t.count(), 8);

    testing::internal::CaptureStdout();
    EXPECT_FALSE(t.build(0, UINT32_MAX, 0, UINT32_MAX, 1, 1));
    out = testing::internal::GetCapturedStdout();
    EXPECT_NE(out.find("[ERROR]    Too many tiles"), std::string::npos);
    EXPECT_EQ(t.count(), 0);
}

TEST(TileTest, HandOutAndAfterTheLast) {
    ox::SpiralTile t;
    ASSERT_TRUE(t.build(0, 63, 0, 63, 32, 32));
    ox::Tile tile;
    for (int i = 0; i < 4; ++i) {
        ASSERT_TRUE(t.nextTile(tile));
        t.markFinished();
    }
    EXPECT_TRUE(t.isDone());
    EXPECT_EQ(t.progress(), 1.0f);
    EXPECT_FALSE(t.nextTile(tile));
    EXPECT_EQ(tile, ox::Tile{});
    t.reset();
    EXPECT_EQ(t.finishedCount(), 0);
    ASSERT_TRUE(t.nextTile(tile));
    EXPECT_EQ(tile, t.tiles()[0]);
}

TEST(TileTest, ConcentricOrderSpiralsOutFromTheMiddle) {
    ox::SpiralTile spiral;
    const Grid expected = {{2, 1}, {3, 1}, {3, 2}, {2, 2}, {1, 2}, {1, 1}, {1, 0}, {2, 0},
                           {3, 0}, {4, 0}, {4, 1}, {4, 2}, {0, 2}, {0, 1}, {0, 0}};
    EXPECT_EQ(orderOf(spiral, 5, 3), expected);
}

TEST(TileTest, EveryOrderHandsOutEachTileOnce) {
    for (int scheme = -1; scheme <= 4; ++scheme) {
        for (int64_t nx = 1; nx <= 19; nx += 3) {
            for (int64_t ny = 1; ny <= 23; ny += 2) {
                auto t = ox::createTileOrder(scheme);
                Grid g = orderOf(*t, nx, ny);
                ASSERT_EQ(int64_t(g.size()), nx * ny) << scheme << " " << nx << "x" << ny;
                std::set<std::pair<int64_t, int64_t>> seen(g.begin(), g.end());
                ASSERT_EQ(seen.size(), g.size());
                for (auto &[x, y] : g) ASSERT_TRUE(x < nx && y < ny);
                if (scheme < 0 || scheme > 3 || scheme == ox::kTileHilbert) {
                    ASSERT_EQ(g, naiveHilbert(nx, ny)) << nx << "x" << ny;
                }
            }
        }
    }
    // Long thin grids: the walks skip what lies outside instead of covering the square.
    for (int scheme : {ox::kTileHilbert, ox::kTileConcentric}) {
        auto t = ox::createTileOrder(scheme);
        ASSERT_TRUE(t->build(0, 299999, 0, 1, 1, 1));
        EXPECT_EQ(t->count(), 600000);
    }
}

TEST(TileTest, RandomOrderIsRepeatable) {
    ox::RandomTile a, b;
    Grid first = orderOf(a, 13, 7), second = orderOf(b, 13, 7);
    EXPECT_EQ(first, second);
    EXPECT_NE(first, orderOf(*ox::createTileOrder(ox::kTileLeftToRight), 13, 7));
    // Above the redraw limit a taken draw goes to the nearest free slot: still every tile
    // exactly once, and still the same order every time.
    ox::RandomTile nearA(16), nearB(16);
    Grid n1 = orderOf(nearA, 40, 30), n2 = orderOf(nearB, 40, 30);
    EXPECT_EQ(n1, n2);
    std::set<std::pair<int64_t, int64_t>> seen(n1.begin(), n1.end());
    EXPECT_EQ(seen.size(), 1200u);
    EXPECT_EQ(n1[0], orderOf(a, 40, 30)[0]);  // a first draw is never redirected
}

}  // namespace
