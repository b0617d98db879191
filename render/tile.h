#pragma once

#include <cstdint>
#include <memory>
#include <vector>

#include "core/types.h"

/// Tiles and the four orders in which the tile renderer hands them out.
namespace ox {

/// The tile orders of the `tileScheme` setting (the values of its TileSchemeType).
enum TileOrder : int32_t {
    kTileHilbert = 0,      ///< "Hilbert"
    kTileLeftToRight = 1,  ///< "LeftToRight"
    kTileConcentric = 2,   ///< "Concentric"
    kTileRandom = 3,       ///< "Random"
};

/// The names of the tile orders in value order.
inline constexpr const char *kTileSchemeNames[] = {"Hilbert", "LeftToRight", "Concentric",
                                                   "Random"};

/// Tile edge used when the requested one is below 1.
constexpr int kDefaultTileSize = 32;

/// A list of tiles in hand-out order. Not thread-safe: the tile renderer guards it with its
/// tile mutex.
class TileInterface {
public:
    virtual ~TileInterface() = default;

    /// Cuts the inclusive region [xMin..xMax] x [yMin..yMax] into tiles of tileWidth x
    /// tileHeight and orders them. An empty region (max < min) gives an empty list; a tile
    /// edge below 1 is warned about and replaced by 32. False (after an error message) when
    /// the list would be too large; the list is then empty. Resets next and finished.
    bool build(uint32_t xMin, uint32_t xMax, uint32_t yMin, uint32_t yMax, int tileWidth,
               int tileHeight);

    /// True when every tile was handed out.
    virtual bool isDone() const { return next_ >= count_; }
    /// Rewinds the hand-out without rebuilding.
    virtual void reset() { next_ = finished_ = 0; }
    /// Hands out the next tile; after the last one returns false and an all-zero tile marked
    /// invalid.
    virtual bool nextTile(Tile &tile);
    /// Counts one tile as finished.
    virtual void markFinished() { ++finished_; }
    /// finished / count (1 for an empty list).
    virtual float progress() const { return count_ > 0 ? float(finished_) / float(count_) : 1.0f; }
    /// The number of finished tiles.
    virtual int32_t finishedCount() const { return finished_; }

    /// The number of tiles.
    int32_t count() const { return count_; }
    /// Tile columns and rows of the last build.
    int64_t columns() const { return nx_; }
    /// Tile rows of the last build.
    int64_t rows() const { return ny_; }
    /// All tiles in hand-out order.
    const std::vector<Tile> &tiles() const { return tiles_; }

protected:
    /// Fills order with every row-major grid index (row * nx + column) exactly once, in
    /// hand-out order. nx, ny >= 1 and nx * ny <= INT32_MAX.
    virtual void arrange(int64_t nx, int64_t ny, std::vector<uint32_t> &order) = 0;

private:
    std::vector<Tile> tiles_;
    int64_t nx_ = 0, ny_ = 0;
    int32_t next_ = 0;
    int32_t count_ = 0;
    int32_t finished_ = 0;
};

/// "LeftToRight": rows from the bottom up, each from left to right.
class LRBTTile final : public TileInterface {
protected:
    void arrange(int64_t nx, int64_t ny, std::vector<uint32_t> &order) override;
};

/// "Random": a shuffled order, the same on every run (generator seed 90210).
class RandomTile final : public TileInterface {
public:
    /// Seed of the order.
    static constexpr uint64_t kSeed = 90210;
    /// Above this many tiles a repeated draw takes the nearest free slot instead of drawing
    /// again, so the order is made in bounded time.
    static constexpr int64_t kRedrawLimit = int64_t(1) << 24;

    /// redrawLimit replaces kRedrawLimit (for tests).
    explicit RandomTile(int64_t redrawLimit = kRedrawLimit) : redrawLimit_(redrawLimit) {}

protected:
    void arrange(int64_t nx, int64_t ny, std::vector<uint32_t> &order) override;

private:
    int64_t redrawLimit_;
};

/// "Concentric": square rings around the centre tile, outwards.
class SpiralTile final : public TileInterface {
protected:
    void arrange(int64_t nx, int64_t ny, std::vector<uint32_t> &order) override;
};

/// "Hilbert": along a Hilbert curve over the tile grid.
class HilbertTile final : public TileInterface {
protected:
    void arrange(int64_t nx, int64_t ny, std::vector<uint32_t> &order) override;
};

/// The Hilbert curve over an nx x ny grid: the curve of the smallest power-of-two square
/// (at least 2 x 2) that holds the grid, starting at (0, 0), with the points outside the
/// grid left out. Parts of the curve that lie wholly outside are skipped, not walked.
class HilbertCurve {
public:
    /// A curve for the grid nx x ny.
    HilbertCurve(int64_t nx, int64_t ny);
    /// The order n: the curve covers 2^n x 2^n points.
    int order() const { return order_; }
    /// Calls emit(x, y) for each grid point along the curve.
    template <typename F>
    void walk(F &&emit) {
        x_ = y_ = 0;
        if (nx_ <= 0 || ny_ <= 0) return;
        emit(x_, y_);
        curve(order_, 0, emit);
    }

private:
    template <typename F>
    void curve(int n, int k, F &emit);
    template <typename F>
    void move(int direction, F &emit);

    int64_t nx_, ny_;
    int order_ = 1;
    int64_t x_ = 0, y_ = 0;
};

/// The order for a scheme value; values outside 0 to 3 give Hilbert.
std::unique_ptr<TileInterface> createTileOrder(int32_t scheme);

// ---------------------------------------------------------------------------------------------

template <typename F>
void HilbertCurve::move(int direction, F &emit) {
    switch (direction) {
        case 0:
            --y_;
            break;
        case 1:
            --x_;
            break;
        case 2:
            ++y_;
            break;
        default:
            ++x_;
            break;
    }
    if (x_ >= 0 && y_ >= 0 && x_ < nx_ && y_ < ny_) emit(x_, y_);
}

template <typename F>
void HilbertCurve::curve(int n, int k, F &emit) {
    // H(n, k) from the current point covers a 2^n square: towards +x, +y for orientations
    // 0 and 1, towards -x, -y for 2 and 3, and ends 2^n - 1 away along x (0, 2) or y (1, 3).
    // A square wholly outside the grid emits nothing and is jumped over.
    const int64_t reach = (int64_t(1) << n) - 1;
    const int64_t minX = k < 2 ? x_ : x_ - reach;
    const int64_t minY = k < 2 ? y_ : y_ - reach;
    if (minX >= nx_ || minY >= ny_) {
        static constexpr int kEndX[4] = {1, 0, -1, 0};
        static constexpr int kEndY[4] = {0, 1, 0, -1};
        x_ += kEndX[k] * reach;
        y_ += kEndY[k] * reach;
        return;
    }
    static constexpr int kMoves1[4][3] = {{2, 3, 0}, {3, 2, 1}, {0, 1, 2}, {1, 0, 3}};
    if (n == 1) {
        for (int m : kMoves1[k]) move(m, emit);
        return;
    }
    // Sub-curve orientations and the connecting moves of each orientation.
    static constexpr int kSub[4][4] = {{1, 0, 0, 3}, {0, 1, 1, 2}, {3, 2, 2, 1}, {2, 3, 3, 0}};
    curve(n - 1, kSub[k][0], emit);
    move(kMoves1[k][0], emit);
    curve(n - 1, kSub[k][1], emit);
    move(kMoves1[k][1], emit);
    curve(n - 1, kSub[k][2], emit);
    move(kMoves1[k][2], emit);
    curve(n - 1, kSub[k][3], emit);
}

}  // namespace ox
