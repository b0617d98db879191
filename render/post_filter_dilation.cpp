#include <algorithm>
#include <cstring>
#ifdef __SSE2__
#include <emmintrin.h>
#endif
#include <limits>
#include <vector>

#include "core/message.h"
#include "render/frame.h"
#include "render/post_filter.h"

/// Edge dilation, band by band of rows, each band with a window of size rows above and below.
/// First, for every texel of the window, the distance along its row to the nearest covered
/// texel (0 for a covered one), capped at size + 1. Then, row by row, the square-ring
/// (Chebyshev) distance to the nearest covered texel, which is the minimum over the rows
/// within size of max(row distance, row offset); it is exactly the radius of the first ring
/// that holds a covered texel. Only that ring is searched for the brightest candidate, in the
/// ring order, so the result is that of scanning every ring from 1 outwards. Sources are read
/// and results written straight in the layers' tiles when the layers allow it.
namespace ox {

namespace {

/// The largest ring radius the 16-bit distances hold (signed, for the vector minima).
constexpr int32_t kMaxDilation = 32766;

/// The rows of a layer as runs of texels: the rows of its tiles when it keeps them
/// addressable, else whole rows of a band buffer that the caller fills (or pastes) itself.
template <typename T>
class PixelRows {
public:
    /// Takes the layer's grid when it has one (a layer written through it must have no
    /// observers).
    PixelRows(LayerT<T> &layer, bool write) : width_(layer.width()), runWidth_(layer.width()) {
        if ((!write || layer.observers().empty()) && layer.tileGrid(grid_)) {
            runWidth_ = grid_.tileWidth;
            // Tiles of a power-of-two size are addressed with shifts.
            const auto isPow2 = [](int32_t v) { return v > 0 && (v & (v - 1)) == 0; };
            if (isPow2(grid_.tileWidth) && isPow2(grid_.tileHeight)) {
                shiftX_ = __builtin_ctz(uint32_t(grid_.tileWidth));
                shiftY_ = __builtin_ctz(uint32_t(grid_.tileHeight));
            }
        }
    }
    bool direct() const { return grid_.base != nullptr; }
    /// Goes through band buffers even when the layer has a grid.
    void dropGrid() { grid_ = TileGrid<T>(), runWidth_ = width_, shiftX_ = -1; }
    /// Without a grid: the buffer holding rows from firstRow on.
    void bind(T *buffer, int32_t firstRow) { buffer_ = buffer, firstRow_ = firstRow; }
    /// Texels per run: run k of a row starts at x = k * runWidth().
    int32_t runWidth() const { return runWidth_; }
    /// The number of texels of run k.
    int32_t runLength(int32_t k) const { return std::min(runWidth_, width_ - k * runWidth_); }
    /// The number of runs of a row.
    int32_t runCount() const { return (width_ + runWidth_ - 1) / runWidth_; }
    /// The first texel of run k of row y.
    T *run(int32_t y, int32_t k) const {
        if (!direct()) return buffer_ + int64_t(y - firstRow_) * width_ + int64_t(k) * runWidth_;
        return grid_.tile(uint32_t(k), uint32_t(y / grid_.tileHeight)) +
               int64_t(y % grid_.tileHeight) * grid_.tileWidth;
    }
    /// Texel (x, y).
    T &at(int32_t x, int32_t y) const {
        if (!direct()) return buffer_[int64_t(y - firstRow_) * width_ + x];
        if (shiftX_ < 0) return run(y, x / runWidth_)[x % runWidth_];
        const int64_t tile = int64_t(y >> shiftY_) * grid_.tilesPerRow + (x >> shiftX_);
        return grid_
            .base[(tile << (shiftX_ + shiftY_)) + (int64_t(y & ((1 << shiftY_) - 1)) << shiftX_) +
                  (x & ((1 << shiftX_) - 1))];
    }

private:
    int32_t width_, runWidth_;
    int shiftX_ = -1, shiftY_ = -1;
    TileGrid<T> grid_;
    T *buffer_ = nullptr;
    int32_t firstRow_ = 0;
};

/// The smallest and largest of n ring radii (all below 32768).
inline void runRange(const uint16_t *d, int32_t n, uint16_t &lo, uint16_t &hi) {
    int32_t i = 0;
#ifdef __SSE2__
    if (n >= 8) {
        __m128i vlo = _mm_set1_epi16(32767), vhi = _mm_setzero_si128();
        for (; i + 8 <= n; i += 8) {
            const __m128i v = _mm_loadu_si128(reinterpret_cast<const __m128i *>(d + i));
            vlo = _mm_min_epi16(vlo, v);
            vhi = _mm_max_epi16(vhi, v);
        }
        alignas(16) uint16_t l[8], h[8];
        _mm_store_si128(reinterpret_cast<__m128i *>(l), vlo);
        _mm_store_si128(reinterpret_cast<__m128i *>(h), vhi);
        for (int k = 0; k < 8; ++k) lo = std::min(lo, l[k]), hi = std::max(hi, h[k]);
    }
#endif
    for (; i < n; ++i) lo = std::min(lo, d[i]), hi = std::max(hi, d[i]);
}

/// One doubling step of the row distances: out[x] = min(in[x], in[x - step] + step,
/// in[x + step] + step) within the row (values stay below 65536 - step). Separate buffers:
/// reading what the step just stored would stall on every vector.
void relaxRow(const uint16_t *__restrict in, uint16_t *__restrict out, int32_t w, int32_t step) {
    const uint16_t s = uint16_t(step);
    auto scalar = [&](int32_t x) {
        uint16_t v = in[x];
        if (x >= step) v = std::min<uint16_t>(v, uint16_t(in[x - step] + s));
        if (x + step < w) v = std::min<uint16_t>(v, uint16_t(in[x + step] + s));
        out[x] = v;
    };
    int32_t x = 0;
    for (; x < std::min(step, w); ++x) scalar(x);
#ifdef __SSE2__
    // Unsigned 16-bit minimum from a saturating subtraction: min(a, b) = a - max(a - b, 0).
    const __m128i sv = _mm_set1_epi16(int16_t(s));
    auto umin = [](__m128i a, __m128i b) { return _mm_sub_epi16(a, _mm_subs_epu16(a, b)); };
    auto load = [&](int32_t at) {
        return _mm_loadu_si128(reinterpret_cast<const __m128i *>(in + at));
    };
    for (; x + 8 + step <= w; x += 8) {
        const __m128i near = _mm_adds_epu16(umin(load(x - step), load(x + step)), sv);
        _mm_storeu_si128(reinterpret_cast<__m128i *>(out + x), umin(load(x), near));
    }
#endif
    for (; x < w; ++x) scalar(x);
}

/// Row distances to the nearest covered texel of rows [y0, y1), capped at cap; depth is the
/// band buffer used when the layer has no grid.
bool rowDistances(LayerT<float> &z, PixelRows<float> zRows, int32_t y0, int32_t y1, uint16_t cap,
                  uint16_t *dist, float *depth, uint16_t *spare) {
    const int32_t w = z.width();
    if (!zRows.direct()) {
        if (!z.read(Region(0, y0, w, y1), depth)) return false;
        zRows.bind(depth, y0);
    }
    const int32_t n = cap - 1;
    for (int32_t y = y0; y < y1; ++y) {
        uint16_t *d = dist + size_t(y - y0) * size_t(w);
        // 0 for covered texels, cap for the others.
        bool anyCovered = false;
        for (int32_t k = 0, x = 0; k < zRows.runCount(); ++k) {
            const float *zr = zRows.run(y, k);
            int32_t i = 0;
            const int32_t e = zRows.runLength(k);
#ifdef __SSE2__
            const __m128i capv = _mm_set1_epi16(int16_t(cap));
            __m128i seen = _mm_setzero_si128();
            for (; i + 8 <= e; i += 8) {
                // NaN compares false: not covered.
                const __m128 lo = _mm_cmpge_ps(_mm_loadu_ps(zr + i), _mm_setzero_ps());
                const __m128 hi = _mm_cmpge_ps(_mm_loadu_ps(zr + i + 4), _mm_setzero_ps());
                const __m128i mask = _mm_packs_epi32(_mm_castps_si128(lo), _mm_castps_si128(hi));
                seen = _mm_or_si128(seen, mask);
                _mm_storeu_si128(reinterpret_cast<__m128i *>(d + x + i),
                                 _mm_andnot_si128(mask, capv));
            }
            anyCovered |= _mm_movemask_epi8(seen) != 0;
#endif
            for (; i < e; ++i) {
                const bool covered = zr[i] >= 0.0f;
                anyCovered |= covered;
                d[x + i] = covered ? 0 : cap;
            }
            x += e;
        }
        if (!anyCovered) continue;
        // Doubling steps: after steps 1, 2, 4, ..., s every distance up to 2s - 1 is exact,
        // and a distance is never below the true one, so distances beyond n stay at cap.
        uint16_t *from = d, *to = spare;
        for (int32_t step = 1, reach = 0; reach < n; reach += step, step *= 2) {
            relaxRow(from, to, w, step);
            std::swap(from, to);
        }
        if (from != d) std::memcpy(d, from, size_t(w) * sizeof(uint16_t));
    }
    return true;
}

/// The index (into the band's window, whose first row is image row rowBase) of the brightest
/// texel of the ring of radius r around (x, y), or -1 when none beat the starting luminance.
/// lum holds the luminance of covered texels and -infinity for background ones (and for
/// covered ones that could never win), so background texels never win.
inline int64_t brightestOnRing(const float *lum, int32_t rowBase, int32_t w, int32_t h, int32_t x,
                               int32_t y, int32_t r) {
    float best = -3.4028235e38f;
    int64_t winner = -1;
    auto visit = [&](int64_t i) {
        if (lum[i] > best) best = lum[i], winner = i;
    };
    const int64_t stride = w;
    const int32_t ya = std::max(0, y - r), yb = std::min(h - 1, y + r);
    if (x - r >= 0)
        for (int64_t i = (ya - rowBase) * stride + (x - r), e = (yb - rowBase) * stride + (x - r);
             i <= e; i += stride)
            visit(i);
    if (x + r < w)
        for (int64_t i = (ya - rowBase) * stride + (x + r), e = (yb - rowBase) * stride + (x + r);
             i <= e; i += stride)
            visit(i);
    const int32_t xa = std::max(0, x - r + 1), xb = std::min(w - 1, x + r - 1);
    if (y + r < h)
        for (int64_t i = (y + r - rowBase) * stride + xa, e = i + (xb - xa); i <= e; ++i) visit(i);
    if (y - r >= 0)
        for (int64_t i = (y - r - rowBase) * stride + xa, e = i + (xb - xa); i <= e; ++i) visit(i);
    return winner;
}

/// One step of the ring radius of a row: d = own (first step, own given), else
/// d = min(d, max(dy, min(lo, hi))). Returns the largest d of the row. Kept apart, with
/// unaliased pointers, so that the compiler vectorizes it.
uint16_t ringRow(const uint16_t *__restrict own, const uint16_t *__restrict lo,
                 const uint16_t *__restrict hi, uint16_t dy, uint16_t *__restrict d, int32_t w) {
    uint16_t m = 0;
    if (own) {
        for (int32_t x = 0; x < w; ++x) {
            d[x] = own[x];
            m = std::max(m, own[x]);
        }
        return m;
    }
    int32_t x = 0;
#ifdef __SSE2__
    // Eight texels at a time; the distances stay below 32768, so signed 16-bit minima work.
    const __m128i step = _mm_set1_epi16(int16_t(dy));
    __m128i top = _mm_setzero_si128();
    for (; x + 8 <= w; x += 8) {
        const __m128i l = _mm_loadu_si128(reinterpret_cast<const __m128i *>(lo + x));
        const __m128i u = _mm_loadu_si128(reinterpret_cast<const __m128i *>(hi + x));
        __m128i *dp = reinterpret_cast<__m128i *>(d + x);
        const __m128i nd =
            _mm_min_epi16(_mm_loadu_si128(dp), _mm_max_epi16(step, _mm_min_epi16(l, u)));
        _mm_storeu_si128(dp, nd);
        top = _mm_max_epi16(top, nd);
    }
    alignas(16) uint16_t lanes[8];
    _mm_store_si128(reinterpret_cast<__m128i *>(lanes), top);
    for (uint16_t v : lanes) m = std::max(m, v);
#endif
    for (; x < w; ++x) {
        const uint16_t v = std::max(dy, std::min(lo[x], hi[x]));
        const uint16_t nd = std::min(d[x], v);
        d[x] = nd;
        m = std::max(m, nd);
    }
    return m;
}

/// The rank of n texels c: their luminance where dist is 0 (covered), -infinity elsewhere,
/// so that only covered texels can win (the ring's radius is known, no other test is needed).
/// A NaN or lowest luminance never beats the starting value either.
void rankRun(const Color *c, const uint16_t *dist, float *lum, int32_t n) {
    const float never = -std::numeric_limits<float>::infinity();
    int32_t i = 0;
#ifdef __SSE2__
    const __m128 kr = _mm_set1_ps(0.299f), kg = _mm_set1_ps(0.587f), kb = _mm_set1_ps(0.114f);
    const __m128 lowest = _mm_set1_ps(-3.4028235e38f), nev = _mm_set1_ps(never);
    for (; i + 4 <= n; i += 4) {
        const __m128i d = _mm_loadl_epi64(reinterpret_cast<const __m128i *>(dist + i));
        const __m128i background = _mm_cmpgt_epi16(d, _mm_setzero_si128());  // d < 32768
        if (_mm_movemask_epi8(background) == 0xffff) {
            // Most of the image: its texels are not even read.
            _mm_storeu_ps(lum + i, nev);
            continue;
        }
        __m128 r = _mm_loadu_ps(&c[i].r), g = _mm_loadu_ps(&c[i + 1].r);
        __m128 b = _mm_loadu_ps(&c[i + 2].r), a = _mm_loadu_ps(&c[i + 3].r);
        _MM_TRANSPOSE4_PS(r, g, b, a);
        // The same operations in the same order as Color::luminance.
        const __m128 v =
            _mm_add_ps(_mm_add_ps(_mm_mul_ps(kr, r), _mm_mul_ps(kg, g)), _mm_mul_ps(kb, b));
        const __m128 covered = _mm_castsi128_ps(_mm_unpacklo_epi16(
            _mm_cmpeq_epi16(d, _mm_setzero_si128()), _mm_cmpeq_epi16(d, _mm_setzero_si128())));
        const __m128 keep = _mm_and_ps(covered, _mm_cmpgt_ps(v, lowest));
        _mm_storeu_ps(lum + i, _mm_or_ps(_mm_and_ps(keep, v), _mm_andnot_ps(keep, nev)));
    }
#endif
    for (; i < n; ++i) {
        if (dist[i] != 0) {
            lum[i] = never;
            continue;
        }
        const float v = c[i].luminance();
        lum[i] = v > -3.4028235e38f ? v : never;
    }
}

/// brightestOnRing for a ring of radius R that lies inside the image, around window index c:
/// unrolled, without branches on the candidates' luminance, and with each side of the ring
/// searched on its own (sides compared afterwards in ring order, a later side winning only
/// when brighter, which is what one scan in ring order gives). Returns the winner's offset
/// from the centre in dx and dy; false when no candidate beats the starting luminance.
template <int R>
inline bool brightestOnInnerRing(const float *lum, int64_t c, int64_t w, int32_t &dx, int32_t &dy) {
    struct Side {
        float best = -3.4028235e38f;
        int32_t k = -1;
        void visit(float v, int32_t ordinal) {
            const bool better = v > best;
            best = better ? v : best;
            k = better ? ordinal : k;
        }
    } left, right, top, bottom;
    for (int i = 0; i <= 2 * R; ++i) {
        left.visit(lum[c + (i - R) * w - R], i);
        right.visit(lum[c + (i - R) * w + R], i);
    }
    for (int i = 0; i <= 2 * R - 2; ++i) {
        top.visit(lum[c + R * w + i - R + 1], i);
        bottom.visit(lum[c - R * w + i - R + 1], i);
    }
    Side win = left;
    int side = 0;
    if (right.best > win.best) win = right, side = 1;
    if (top.best > win.best) win = top, side = 2;
    if (bottom.best > win.best) win = bottom, side = 3;
    if (win.k < 0) return false;
    switch (side) {
        case 0:
            dx = -R, dy = win.k - R;
            break;
        case 1:
            dx = R, dy = win.k - R;
            break;
        case 2:
            dx = win.k - R + 1, dy = R;
            break;
        default:
            dx = win.k - R + 1, dy = -R;
            break;
    }
    return true;
}

#ifdef __SSE2__
/// brightestOnInnerRing for the four texels from window index c on, which share the ring
/// radius R and whose rings lie inside the image: the four rings are scanned side by side, one
/// vector lane each, with the same comparisons in the same order. found[j] is false when no
/// candidate of texel j beats the starting luminance.
template <int R>
inline void brightestOnInnerRing4(const float *lum, int64_t c, int64_t w, int32_t dx[4],
                                  int32_t dy[4], bool found[4]) {
    struct Side {
        __m128 best = _mm_set1_ps(-3.4028235e38f);
        __m128i k = _mm_set1_epi32(-1);
        void visit(const float *at, int32_t ordinal) {
            const __m128 v = _mm_loadu_ps(at);
            const __m128i better = _mm_castps_si128(_mm_cmpgt_ps(v, best));
            best = _mm_max_ps(v, best);  // no NaN: equal values keep the same value
            k = _mm_or_si128(_mm_and_si128(better, _mm_set1_epi32(ordinal)),
                             _mm_andnot_si128(better, k));
        }
    } left, right, top, bottom;
    for (int i = 0; i <= 2 * R; ++i) {
        left.visit(lum + c + (i - R) * w - R, i);
        right.visit(lum + c + (i - R) * w + R, i);
    }
    for (int i = 0; i <= 2 * R - 2; ++i) {
        top.visit(lum + c + R * w + i - R + 1, i);
        bottom.visit(lum + c - R * w + i - R + 1, i);
    }
    // The sides in ring order, a later one winning only when brighter.
    __m128 best = left.best;
    __m128i k = left.k, side = _mm_setzero_si128();
    auto take = [&](const Side &o, int32_t which) {
        const __m128i better = _mm_castps_si128(_mm_cmpgt_ps(o.best, best));
        best = _mm_max_ps(o.best, best);
        k = _mm_or_si128(_mm_and_si128(better, o.k), _mm_andnot_si128(better, k));
        side = _mm_or_si128(_mm_and_si128(better, _mm_set1_epi32(which)),
                            _mm_andnot_si128(better, side));
    };
    take(right, 1);
    take(top, 2);
    take(bottom, 3);
    alignas(16) int32_t ks[4], sides[4];
    _mm_store_si128(reinterpret_cast<__m128i *>(ks), k);
    _mm_store_si128(reinterpret_cast<__m128i *>(sides), side);
    for (int j = 0; j < 4; ++j) {
        found[j] = ks[j] >= 0;
        switch (sides[j]) {
            case 0:
                dx[j] = -R, dy[j] = ks[j] - R;
                break;
            case 1:
                dx[j] = R, dy[j] = ks[j] - R;
                break;
            case 2:
                dx[j] = ks[j] - R + 1, dy[j] = R;
                break;
            default:
                dx[j] = ks[j] - R + 1, dy[j] = -R;
                break;
        }
    }
}
#endif

/// Rings up to this size are scanned texel by texel; larger ones use RunPeaks.
constexpr int32_t kDirectScanMax = 6;
static_assert(kDirectScanMax == 6, "brightestOnInnerRing is dispatched for radii 1 to 6");

/// floor(log2(v)) for v >= 1.
inline int log2Floor(uint32_t v) { return 31 - __builtin_clz(v); }

/// out[i] = max(a[i], b[i]) for n values (no NaN among them).
inline void maxOf(const float *a, const float *b, float *out, int32_t n) {
    int32_t i = 0;
#ifdef __SSE2__
    for (; i + 4 <= n; i += 4)
        _mm_storeu_ps(out + i, _mm_max_ps(_mm_loadu_ps(a + i), _mm_loadu_ps(b + i)));
#endif
    for (; i < n; ++i) out[i] = std::max(a[i], b[i]);
}

/// Sparse tables over a band's window: row[k] holds, for every texel, the highest luminance
/// of the 2^k texels from it to the right, col[k] the same upwards (level 0 is the luminance
/// itself). Any run along a row or a column is then answered from two overlapping entries.
struct RunPeaks {
    static constexpr int kLevels = 16;
    ScratchBlock rowBlocks[kLevels], colBlocks[kLevels];
    float *row[kLevels] = {}, *col[kLevels] = {};

    void build(ScratchPool &pool, const float *lum, int32_t w, int32_t rows, int rowLevels,
               int colLevels) {
        const size_t n = size_t(w) * size_t(rows);
        for (int k = 1; k <= rowLevels; ++k) {
            float *t = row[k] = scratchArray<float>(pool, rowBlocks[k], n);
            const float *prev = k == 1 ? lum : row[k - 1];
            const int32_t half = 1 << (k - 1);
            if (2 * half > w) continue;  // no run of this length fits a row
            for (int32_t y = 0; y < rows; ++y) {
                const size_t base = size_t(y) * size_t(w);
                maxOf(prev + base, prev + base + half, t + base, w - 2 * half + 1);
            }
        }
        for (int k = 1; k <= colLevels; ++k) {
            float *t = col[k] = scratchArray<float>(pool, colBlocks[k], n);
            const float *prev = k == 1 ? lum : col[k - 1];
            const int32_t half = 1 << (k - 1);
            for (int32_t y = 0; y + 2 * half <= rows; ++y) {
                const size_t base = size_t(y) * size_t(w);
                maxOf(prev + base, prev + base + size_t(half) * size_t(w), t + base, w);
            }
        }
    }

    /// The highest luminance of window row wy from xa to xb (inclusive).
    float alongRow(const float *lum, int32_t w, int32_t wy, int32_t xa, int32_t xb) const {
        const int k = log2Floor(uint32_t(xb - xa + 1));
        const size_t i = size_t(wy) * size_t(w) + size_t(xa);
        if (k == 0) return lum[i];
        return std::max(row[k][i], row[k][size_t(wy) * size_t(w) + size_t(xb - (1 << k) + 1)]);
    }

    /// The first texel (window index) of window row wy from xa to xb whose luminance is best,
    /// the highest of the run: blocks without it are skipped, largest first.
    int64_t firstAlongRow(const float *lum, int32_t w, int32_t wy, int32_t xa, int32_t xb,
                          float best) const {
        const size_t base = size_t(wy) * size_t(w);
        int32_t p = xa;
        for (int k = log2Floor(uint32_t(xb - xa + 1)); k >= 0; --k) {
            if (p + (1 << k) - 1 > xb) continue;
            if ((k == 0 ? lum : row[k])[base + size_t(p)] < best) p += 1 << k;
        }
        return int64_t(base) + p;
    }

    /// The same along window column x from row ya to yb.
    int64_t firstAlongColumn(const float *lum, int32_t w, int32_t x, int32_t ya, int32_t yb,
                             float best) const {
        int32_t p = ya;
        for (int k = log2Floor(uint32_t(yb - ya + 1)); k >= 0; --k) {
            if (p + (1 << k) - 1 > yb) continue;
            if ((k == 0 ? lum : col[k])[size_t(p) * size_t(w) + size_t(x)] < best) p += 1 << k;
        }
        return int64_t(p) * w + x;
    }

    /// The highest luminance of window column x from row ya to yb (inclusive).
    float alongColumn(const float *lum, int32_t w, int32_t x, int32_t ya, int32_t yb) const {
        const int k = log2Floor(uint32_t(yb - ya + 1));
        const size_t i = size_t(ya) * size_t(w) + size_t(x);
        if (k == 0) return lum[i];
        return std::max(col[k][i], col[k][size_t(yb - (1 << k) + 1) * size_t(w) + size_t(x)]);
    }
};

/// brightestOnRing answered from the run peaks: the highest luminance of each of the four
/// sides, compared in ring order (a later side wins only when brighter), then the first texel
/// of the winning side that has it.
inline int64_t brightestOnRingFast(const RunPeaks &t, const float *lum, int32_t rowBase, int32_t w,
                                   int32_t h, int32_t x, int32_t y, int32_t r) {
    float best = -3.4028235e38f;
    int side = -1;
    auto visit = [&](float v, int s) {
        if (v > best) best = v, side = s;
    };
    const int32_t ya = std::max(0, y - r) - rowBase, yb = std::min(h - 1, y + r) - rowBase;
    if (x - r >= 0) visit(t.alongColumn(lum, w, x - r, ya, yb), 0);
    if (x + r < w) visit(t.alongColumn(lum, w, x + r, ya, yb), 1);
    const int32_t xa = std::max(0, x - r + 1), xb = std::min(w - 1, x + r - 1);
    if (xa <= xb) {
        if (y + r < h) visit(t.alongRow(lum, w, y + r - rowBase, xa, xb), 2);
        if (y - r >= 0) visit(t.alongRow(lum, w, y - r - rowBase, xa, xb), 3);
    }
    if (side < 0) return -1;
    if (side <= 1) return t.firstAlongColumn(lum, w, side == 0 ? x - r : x + r, ya, yb, best);
    return t.firstAlongRow(lum, w, (side == 2 ? y + r : y - r) - rowBase, xa, xb, best);
}

/// Per-thread scratch of the dilation rows.
struct DilationScratch {
    explicit DilationScratch(ScratchPool &p) : pool(&p) {}
    ScratchPool *pool;
    ScratchBlock ring;   // uint16_t: ring radius per texel of the band
    ScratchBlock rows;   // Color: source rows of the band and its margins
    ScratchBlock lum;    // float: their luminance, -infinity for background texels
    RunPeaks runs;       // over lum, for large rings
    ScratchBlock out;    // Color: result rows of the band
    ScratchBlock depth;  // float: "Z" rows of a band
    ScratchBlock spare;  // uint16_t: a row of distances
    ScratchBlock dist;   // uint16_t: row distances of the band's window
};

}  // namespace

bool EdgeDilationFilter::execute(Frame &frame, RenderContext &, RenderIOInterface &io) {
    return run(frame, &io);
}

bool EdgeDilationFilter::run(Frame &frame, RenderIOInterface *io) {
    std::vector<LayerT<Color> *> sources;
    for (const std::string &name : sources_) {
        LayerT<Color> *layer = frame.getColorLayer(name);
        if (!layer) {
            message(kMsgError, 6, "Source layer %s not found in edge dilation filter",
                    name.c_str());
            return false;
        }
        sources.push_back(layer);
    }
    LayerT<float> *z = frame.getFloatLayer("Z");
    if (!z) {
        message(kMsgError, 6, "Source Z layer not found in edge dilation filter");
        return false;
    }
    const int32_t w = frame.width(), h = frame.height();
    // A ring wider than the image holds no texel of it.
    const int32_t n = std::clamp(size_, 0, std::min(kMaxDilation, std::max(w, h)));
    const uint16_t cap = uint16_t(n + 1);

    FilterResults results(frame);
    std::vector<LayerT<Color> *> outputs;
    for (const std::string &name : sources_) {
        LayerT<Color> *out = results.addColor(name + "_edgedilation", name, "edge dilation filter");
        if (!out) return false;
        outputs.push_back(out);
    }

    if (w == 0 || h == 0) return results.place(sources_);
    std::vector<DilationScratch> scratch;
    for (int t = 0; t < std::max(threads_, 1); ++t) scratch.emplace_back(frame.scratch());
    const PixelRows<float> zRows(*z, false);

    const std::vector<uint16_t> farRow(size_t(w), cap);  // stands for rows outside the image
    std::vector<PixelRows<Color>> srcRows, dstRows;
    for (size_t l = 0; l < sources.size(); ++l) {
        srcRows.emplace_back(*sources[l], false);
        dstRows.emplace_back(*outputs[l], true);
        // Source and result are walked run by run together.
        if (srcRows[l].runWidth() != dstRows[l].runWidth())
            srcRows[l].dropGrid(), dstRows[l].dropGrid();
    }
    // Each band also ranks n rows above and below it: tall bands keep that margin small, short
    // ones keep the band's texels in the cache between ranking and filling.
    const int32_t bandRows = (std::max(kFilterBandRows, 8 * n) + kFilterBandRows - 1) /
                             kFilterBandRows * kFilterBandRows;
    RowBands bands(h, bandRows, threads_, io);
    const bool ok = bands.run([&](int32_t y0, int32_t y1, int thread) {
        DilationScratch &s = scratch[size_t(thread)];
        const size_t bandSize = size_t(w) * size_t(y1 - y0);
        uint16_t *const ring = scratchArray<uint16_t>(*s.pool, s.ring, bandSize);

        // The band reaches n rows above and below itself: its window.
        const int32_t rowBase = std::max(0, y0 - n), rowEnd = std::min(h, y1 + n);
        const size_t window = size_t(w) * size_t(rowEnd - rowBase);

        // The row distances of the window (adjacent bands compute their shared margins twice;
        // a whole-image table would cost more in memory traffic).
        uint16_t *const windowDist = scratchArray<uint16_t>(*s.pool, s.dist, window);
        float *depth = zRows.direct() ? nullptr : scratchArray<float>(*s.pool, s.depth, window);
        uint16_t *spare = scratchArray<uint16_t>(*s.pool, s.spare, size_t(w));
        if (!rowDistances(*z, zRows, rowBase, rowEnd, cap, windowDist, depth, spare)) {
            message(kMsgError, 6, "Edge dilation could not read the Z layer");
            return false;
        }
        auto distRow = [&](int32_t y) {
            return y >= 0 && y < h ? windowDist + size_t(y - rowBase) * size_t(w) : farRow.data();
        };

        // The ring radius of every texel of the band.
        for (int32_t y = y0; y < y1; ++y) {
            uint16_t m =
                ringRow(distRow(y), nullptr, nullptr, 0, ring + size_t(y - y0) * size_t(w), w);
            for (int32_t dy = 1; dy <= n && m > dy; ++dy)
                m = ringRow(nullptr, distRow(y - dy), distRow(y + dy), uint16_t(dy),
                            ring + size_t(y - y0) * size_t(w), w);
        }

        float *const lum = scratchArray<float>(*s.pool, s.lum, window);
        for (size_t l = 0; l < sources.size(); ++l) {
            PixelRows<Color> src = srcRows[l], dst = dstRows[l];
            if (!src.direct()) {
                Color *rows = scratchArray<Color>(*s.pool, s.rows, window);
                if (!sources[l]->read(Region(0, rowBase, w, rowEnd), rows)) {
                    message(kMsgError, 6, "Edge dilation could not read layer %s",
                            sources_[l].c_str());
                    return false;
                }
                src.bind(rows, rowBase);
            }
            if (!dst.direct()) dst.bind(scratchArray<Color>(*s.pool, s.out, bandSize), y0);
            Color *const runBuffer =
                dst.direct() ? scratchArray<Color>(*s.pool, s.out, size_t(dst.runWidth()))
                             : nullptr;
            // The luminance of window row y.
            auto rankRow = [&](int32_t y) {
                const size_t row = size_t(y - rowBase) * size_t(w);
                for (int32_t k = 0; k < src.runCount(); ++k) {
                    const Color *c = src.run(y, k);
                    const size_t x0 = row + size_t(k) * size_t(src.runWidth());
                    rankRun(c, windowDist + x0, lum + x0, src.runLength(k));
                }
            };
            const bool fast = n > kDirectScanMax;
            int32_t ranked = rowBase;  // window rows [rowBase, ranked) have their luminance
            if (fast) {
                for (; ranked < rowEnd; ++ranked) rankRow(ranked);
                s.runs.build(*s.pool, lum, w, rowEnd - rowBase, log2Floor(uint32_t(2 * n - 1)),
                             log2Floor(uint32_t(2 * n + 1)));
            }
            for (int32_t y = y0; y < y1; ++y) {
                // Small rings: a row is ranked just before the first row that can reach it, so
                // the texels it read are still in the cache when they are copied or win.
                for (const int32_t need = std::min(rowEnd, y + n + 1); ranked < need; ++ranked)
                    rankRow(ranked);
                const uint16_t *d = ring + size_t(y - y0) * size_t(w);
                for (int32_t k = 0; k < src.runCount(); ++k) {
                    const Color *from = src.run(y, k);
                    // In place, results go to the tile through a run buffer (see streamColors).
                    Color *const tile = dst.run(y, k);
                    Color *const to = dst.direct() ? runBuffer : tile;
                    const int32_t x0 = k * src.runWidth(), len = src.runLength(k);
                    // Most runs lie wholly inside an island or wholly out of reach.
                    uint16_t lo = 65535, hi = 0;
                    runRange(d + x0, len, lo, hi);
                    if (hi == 0 || lo > n) {
                        if (hi == 0 && dst.direct())
                            streamColors(tile, from, len);
                        else if (hi == 0)
                            std::memcpy(tile, from, size_t(len) * sizeof(Color));
                        else if (dst.direct())
                            streamFill(tile, background_, len);
                        else
                            std::fill(tile, tile + len, background_);
                        continue;
                    }
                    for (int32_t i = 0; i < len; ++i) {
                        const int32_t x = x0 + i, r = d[x];
                        if (r == 0) {
                            to[i] = from[i];
                            continue;
                        }
                        int64_t win = -1;
                        if (r > n) {
                            // No covered texel within reach: the background colour.
                        } else if (fast) {
                            win = brightestOnRingFast(s.runs, lum, rowBase, w, h, x, y, r);
                        } else if (x >= r && x + r < w && y >= r && y + r < h) {
                            const int64_t c = int64_t(y - rowBase) * w + x;
#ifdef __SSE2__
                            // Four neighbours on rings of the same radius (common along the
                            // edges of islands) are searched together.
                            if (i + 4 <= len && x + 3 + r < w && d[x + 1] == r && d[x + 2] == r &&
                                d[x + 3] == r) {
                                int32_t dx4[4], dy4[4];
                                bool found4[4];
                                switch (r) {
                                    case 1:
                                        brightestOnInnerRing4<1>(lum, c, w, dx4, dy4, found4);
                                        break;
                                    case 2:
                                        brightestOnInnerRing4<2>(lum, c, w, dx4, dy4, found4);
                                        break;
                                    case 3:
                                        brightestOnInnerRing4<3>(lum, c, w, dx4, dy4, found4);
                                        break;
                                    case 4:
                                        brightestOnInnerRing4<4>(lum, c, w, dx4, dy4, found4);
                                        break;
                                    case 5:
                                        brightestOnInnerRing4<5>(lum, c, w, dx4, dy4, found4);
                                        break;
                                    default:
                                        brightestOnInnerRing4<6>(lum, c, w, dx4, dy4, found4);
                                        break;
                                }
                                for (int j = 0; j < 4; ++j)
                                    to[i + j] = found4[j] ? src.at(x + j + dx4[j], y + dy4[j])
                                                          : background_;
                                i += 3;
                                continue;
                            }
#endif
                            int32_t dx = 0, dy = 0;
                            bool found = false;
                            switch (r) {
                                case 1:
                                    found = brightestOnInnerRing<1>(lum, c, w, dx, dy);
                                    break;
                                case 2:
                                    found = brightestOnInnerRing<2>(lum, c, w, dx, dy);
                                    break;
                                case 3:
                                    found = brightestOnInnerRing<3>(lum, c, w, dx, dy);
                                    break;
                                case 4:
                                    found = brightestOnInnerRing<4>(lum, c, w, dx, dy);
                                    break;
                                case 5:
                                    found = brightestOnInnerRing<5>(lum, c, w, dx, dy);
                                    break;
                                default:
                                    found = brightestOnInnerRing<6>(lum, c, w, dx, dy);
                                    break;
                            }
                            to[i] = found ? src.at(x + dx, y + dy) : background_;
                            continue;
                        } else {
                            win = brightestOnRing(lum, rowBase, w, h, x, y, r);
                        }
                        if (win < 0) {
                            to[i] = background_;
                            continue;
                        }
                        const int32_t wy = int32_t(win / w);
                        to[i] = src.at(int32_t(win - int64_t(wy) * w), rowBase + wy);
                    }
                    if (dst.direct()) streamColors(tile, runBuffer, len);
                }
            }
            streamFence();
            if (!dst.direct() && !outputs[l]->paste(Region(0, y0, w, y1), dst.run(y0, 0))) {
                message(kMsgError, 6, "Edge dilation could not write layer %s",
                        outputs[l]->name().c_str());
                return false;
            }
        }
        return true;
    });
    if (!ok) {
        if (bands.aborted()) message(kMsgProgress, 6, "Edge dilation aborted");
        return false;  // the results leave the frame with `results`
    }
    return results.place(sources_);
}

}  // namespace ox
