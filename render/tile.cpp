#include "render/tile.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <new>

#include "core/message.h"
#include "core/random.h"

namespace ox {

bool TileInterface::build(uint32_t xMin, uint32_t xMax, uint32_t yMin, uint32_t yMax, int tileWidth,
                          int tileHeight) {
    tiles_.clear();
    nx_ = ny_ = 0;
    next_ = finished_ = count_ = 0;
    if (tileWidth < 1 || tileHeight < 1) {
        message(kMsgWarning, 6, "Tile size %d x %d is below 1, using %d", tileWidth, tileHeight,
                kDefaultTileSize);
        if (tileWidth < 1) tileWidth = kDefaultTileSize;
        if (tileHeight < 1) tileHeight = kDefaultTileSize;
    }
    if (xMax < xMin || yMax < yMin) return true;
    // Signed 64-bit throughout: a region may span the whole 32-bit range.
    const int64_t w = int64_t(xMax) - xMin + 1, h = int64_t(yMax) - yMin + 1;
    const int64_t tw = tileWidth, th = tileHeight;
    const int64_t nx = (w + tw - 1) / tw, ny = (h + th - 1) / th;
    if (nx > std::numeric_limits<int32_t>::max() / ny) {
        message(kMsgError, 6, "Too many tiles: %lld x %lld tiles of %d x %d", (long long)nx,
                (long long)ny, tileWidth, tileHeight);
        return false;
    }
    const int64_t count = nx * ny;
    try {
        std::vector<uint32_t> order;
        order.reserve(size_t(count));
        arrange(nx, ny, order);
        tiles_.resize(size_t(count));
        for (int64_t k = 0; k < count; ++k) {
            const int64_t i = order[size_t(k)] % nx, j = order[size_t(k)] / nx;
            Tile &t = tiles_[size_t(k)];
            t.xMin = uint32_t(xMin + i * tw);
            t.xMax = uint32_t(std::min(xMin + (i + 1) * tw - 1, int64_t(xMax)));
            t.yMin = uint32_t(yMin + j * th);
            t.yMax = uint32_t(std::min(yMin + (j + 1) * th - 1, int64_t(yMax)));
            t.valid = true;
            t.index = order[size_t(k)];
        }
    } catch (const std::bad_alloc &) {
        tiles_.clear();
        tiles_.shrink_to_fit();
        message(kMsgError, 6, "Not enough memory for %lld tiles", (long long)count);
        return false;
    }
    nx_ = nx;
    ny_ = ny;
    count_ = int32_t(count);
    return true;
}

bool TileInterface::nextTile(Tile &tile) {
    if (next_ >= count_) {
        tile = Tile{};
        return false;
    }
    tile = tiles_[size_t(next_++)];
    return true;
}

void LRBTTile::arrange(int64_t nx, int64_t ny, std::vector<uint32_t> &order) {
    const int64_t count = nx * ny;
    for (int64_t k = 0; k < count; ++k) order.push_back(uint32_t(k));
}

void RandomTile::arrange(int64_t nx, int64_t ny, std::vector<uint32_t> &order) {
    const int64_t count = nx * ny;
    Random random(kSeed);
    auto draw = [&] {
        // r * (count - 1) rounded half away from zero.
        return int64_t(std::round(double(random.next()) * double(count - 1)));
    };
    std::vector<uint8_t> taken(size_t(count), 0);
    if (count <= redrawLimit_) {
        for (int64_t placed = 0; placed < count;) {
            int64_t k = draw();
            if (taken[size_t(k)]) continue;
            taken[size_t(k)] = 1;
            order.push_back(uint32_t(k));
            ++placed;
        }
        return;
    }
    // Redrawing until a free slot comes up would take very long on huge lists (and the
    // generator cannot reach every slot of them), so a taken draw goes to the nearest free
    // slot, the lower one on a tie. above[i] / below[i] lead to the nearest free slot at or
    // above / at or below i (count / -1 when there is none), kept short by path halving.
    std::vector<uint32_t> above(size_t(count + 1)), below(size_t(count + 1));
    for (int64_t i = 0; i <= count; ++i) above[size_t(i)] = below[size_t(i)] = uint32_t(i);
    // below is stored shifted by one, so that slot 0 of it stands for "none".
    auto findAbove = [&](int64_t i) {
        while (above[size_t(i)] != uint32_t(i)) {
            above[size_t(i)] = above[size_t(above[size_t(i)])];
            i = above[size_t(i)];
        }
        return i;
    };
    auto findBelow = [&](int64_t i) {  // i and the result are shifted by one
        while (below[size_t(i)] != uint32_t(i)) {
            below[size_t(i)] = below[size_t(below[size_t(i)])];
            i = below[size_t(i)];
        }
        return i;
    };
    for (int64_t placed = 0; placed < count; ++placed) {
        int64_t k = draw();
        if (taken[size_t(k)]) {
            int64_t up = findAbove(k);
            int64_t down = findBelow(k + 1) - 1;
            if (up == count) {
                k = down;
            } else if (down < 0) {
                k = up;
            } else {
                k = (k - down <= up - k) ? down : up;
            }
        }
        taken[size_t(k)] = 1;
        above[size_t(k)] = uint32_t(k + 1);
        below[size_t(k + 1)] = uint32_t(k);
        order.push_back(uint32_t(k));
    }
}

void SpiralTile::arrange(int64_t nx, int64_t ny, std::vector<uint32_t> &order) {
    const int64_t count = nx * ny;
    const int64_t cx = (nx - 1) / 2, cy = (ny - 1) / 2;
    auto put = [&](int64_t x, int64_t y) {
        if (x >= 0 && y >= 0 && x < nx && y < ny) order.push_back(uint32_t(y * nx + x));
    };
    put(cx, cy);
    put(cx + 1, cy);
    put(cx + 1, cy + 1);
    put(cx, cy + 1);
    // Each side of a ring is clipped to the grid before it is walked, so a long thin grid
    // costs its tiles plus one step per ring, not the area of the square.
    auto clip = [](int64_t lo, int64_t hi, int64_t n) {
        return std::pair<int64_t, int64_t>(std::max<int64_t>(lo, 0), std::min(hi, n - 1));
    };
    for (int64_t k = 1; int64_t(order.size()) < count; ++k) {
        const int64_t left = cx - k, right = cx + k + 1, bottom = cy - k, top = cy + k + 1;
        put(left, cy + k);
        if (left >= 0) {  // down the left column
            auto [lo, hi] = clip(bottom, cy + k - 1, ny);
            for (int64_t y = hi; y >= lo; --y) order.push_back(uint32_t(y * nx + left));
        }
        if (bottom >= 0) {  // right along the bottom row
            auto [lo, hi] = clip(left + 1, right, nx);
            for (int64_t x = lo; x <= hi; ++x) order.push_back(uint32_t(bottom * nx + x));
        }
        if (right < nx) {  // up the right column
            auto [lo, hi] = clip(bottom + 1, top, ny);
            for (int64_t y = lo; y <= hi; ++y) order.push_back(uint32_t(y * nx + right));
        }
        if (top < ny) {  // left along the top row
            auto [lo, hi] = clip(left, right - 1, nx);
            for (int64_t x = hi; x >= lo; --x) order.push_back(uint32_t(top * nx + x));
        }
    }
}

void HilbertTile::arrange(int64_t nx, int64_t ny, std::vector<uint32_t> &order) {
    HilbertCurve curve(nx, ny);
    curve.walk([&](int64_t x, int64_t y) { order.push_back(uint32_t(y * nx + x)); });
}

HilbertCurve::HilbertCurve(int64_t nx, int64_t ny) : nx_(nx), ny_(ny) {
    const int64_t size = std::max(nx, ny);
    for (int64_t s = 2; s < size; s *= 2) ++order_;
}

std::unique_ptr<TileInterface> createTileOrder(int32_t scheme) {
    switch (scheme) {
        case kTileLeftToRight:
            return std::make_unique<LRBTTile>();
        case kTileConcentric:
            return std::make_unique<SpiralTile>();
        case kTileRandom:
            return std::make_unique<RandomTile>();
        default:
            return std::make_unique<HilbertTile>();
    }
}

}  // namespace ox
