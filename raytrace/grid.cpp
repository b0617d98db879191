#include "raytrace/grid.h"

#include <emmintrin.h>

#include <algorithm>
#include <bit>
#include <cmath>
#include <cstring>
#include <limits>
#include <stdexcept>
#include <string>
#include <utility>

#include "core/message.h"
#include "raytrace/intersect_wide.h"
#include "raytrace/motion_blur.h"

namespace ox {

namespace {

constexpr double kMaxCells = double(1u << 28);

struct D3 {
    double x, y, z;
    double operator[](int a) const { return a == 0 ? x : (a == 1 ? y : z); }
};
D3 sub(const D3 &a, const D3 &b) { return {a.x - b.x, a.y - b.y, a.z - b.z}; }
D3 crossD(const D3 &a, const D3 &b) {
    return {a.y * b.z - a.z * b.y, a.z * b.x - a.x * b.z, a.x * b.y - a.y * b.x};
}
double dotD(const D3 &a, const D3 &b) { return a.x * b.x + a.y * b.y + a.z * b.z; }

// Separating-axis test of a triangle against boxes in double precision, on the axes that can
// separate them. Along a box axis on which the triangle's extent lies inside every box tested
// ("held" axes), that face axis never separates, and one held axis c reduces the test to the
// plane across it: the other two face axes and the edge normals c x edge (the triangle meets
// the box exactly when its shadow in that plane meets the box's). With two held axes only the
// third face axis is left. Otherwise the test takes all of them: the face axes, the nine edge
// cross axes and the triangle plane. Each edge cross axis has a zero component, left out of its
// products (the sums are the same); the three axes of one unit axis are tested two lanes at a
// time, each lane with the scalar operations. What depends only on the triangle is computed
// once.
class TriangleBoxTest {
public:
    /// free: bit a set when the triangle's extent along axis a may reach beyond the boxes'.
    TriangleBoxTest(const Vec3 &a, const Vec3 &b, const Vec3 &c, uint32_t free) {
        constexpr float kInf = std::numeric_limits<float>::infinity();
        for (int axis = 0; axis < 3; ++axis) {
            const bool tested = free >> axis & 1;
            lo_[axis] = tested ? std::min({a[axis], b[axis], c[axis]}) : -kInf;
            hi_[axis] = tested ? std::max({a[axis], b[axis], c[axis]}) : kInf;
        }
        const int freeCount = std::popcount(free);
        if (freeCount == 1) return;
        const D3 v[3] = {{a.x, a.y, a.z}, {b.x, b.y, b.z}, {c.x, c.y, c.z}};
        const D3 e[3] = {sub(v[1], v[0]), sub(v[2], v[1]), sub(v[0], v[2])};
        for (int g = 0; g < 3; ++g) {
            if (freeCount == 2 && (free >> g & 1)) continue;
            CrossAxes &x = cross_[groups_++];
            // Unit axis g crossed with the edge: (0, -e.z, e.y), (e.z, 0, -e.x), (-e.y, e.x, 0).
            x.u = g == 0 ? 1 : 0;
            x.w = g == 2 ? 1 : 2;
            x.p[3] = x.q[3] = x.absP[3] = x.absQ[3] = x.min[3] = x.max[3] = 0.0;
            for (int k = 0; k < 3; ++k) {
                const D3 &d = e[k];
                const double p = g == 0 ? -d.z : (g == 1 ? d.z : -d.y);
                const double q = g == 0 ? d.y : (g == 1 ? -d.x : d.x);
                const double p0 = v[0][x.u] * p + v[0][x.w] * q;
                const double p1 = v[1][x.u] * p + v[1][x.w] * q;
                const double p2 = v[2][x.u] * p + v[2][x.w] * q;
                x.p[k] = p, x.q[k] = q;
                x.absP[k] = std::fabs(p), x.absQ[k] = std::fabs(q);
                x.min[k] = std::min({p0, p1, p2});
                x.max[k] = std::max({p0, p1, p2});
            }
        }
        if (freeCount == 3) {
            normal_ = crossD(e[0], e[1]);
            double p0 = dotD(v[0], normal_), p1 = dotD(v[1], normal_), p2 = dotD(v[2], normal_);
            normalMin_ = std::min({p0, p1, p2});
            normalMax_ = std::max({p0, p1, p2});
        }
    }

    /// The same test for a box (its face axes only).
    explicit TriangleBoxTest(const BBox &b) {
        for (int axis = 0; axis < 3; ++axis) lo_[axis] = b.min[axis], hi_[axis] = b.max[axis];
    }

    /// True when the triangle and the box overlap.
    bool overlaps(const BBox &box) const {
        if ((lo_[0] > box.max.x) | (hi_[0] < box.min.x) | (lo_[1] > box.max.y) |
            (hi_[1] < box.min.y) | (lo_[2] > box.max.z) | (hi_[2] < box.min.z))
            return false;
        if (!groups_) return true;
        const double lo[3] = {box.min.x, box.min.y, box.min.z};
        const double hi[3] = {box.max.x, box.max.y, box.max.z};
        const double center[3] = {0.5 * (lo[0] + hi[0]), 0.5 * (lo[1] + hi[1]),
                                  0.5 * (lo[2] + hi[2])};
        const double h[3] = {0.5 * (hi[0] - lo[0]), 0.5 * (hi[1] - lo[1]), 0.5 * (hi[2] - lo[2])};
        const __m128d sign = _mm_set1_pd(-0.0);
        for (int g = 0; g < groups_; ++g) {
            const CrossAxes &x = cross_[g];
            const __m128d cu = _mm_set1_pd(center[x.u]), cw = _mm_set1_pd(center[x.w]);
            const __m128d hu = _mm_set1_pd(h[x.u]), hw = _mm_set1_pd(h[x.w]);
            for (int k = 0; k < 4; k += 2) {
                // c = cu p + cw q, r = hu |p| + hw |q|; apart when min - c > r or max - c < -r.
                const __m128d c = _mm_add_pd(_mm_mul_pd(cu, _mm_load_pd(x.p + k)),
                                             _mm_mul_pd(cw, _mm_load_pd(x.q + k)));
                const __m128d r = _mm_add_pd(_mm_mul_pd(hu, _mm_load_pd(x.absP + k)),
                                             _mm_mul_pd(hw, _mm_load_pd(x.absQ + k)));
                const __m128d apart = _mm_or_pd(
                    _mm_cmpgt_pd(_mm_sub_pd(_mm_load_pd(x.min + k), c), r),
                    _mm_cmplt_pd(_mm_sub_pd(_mm_load_pd(x.max + k), c), _mm_xor_pd(r, sign)));
                if (_mm_movemask_pd(apart)) return false;
            }
        }
        if (groups_ == 3) {
            const D3 &l = normal_;
            double c = center[0] * l.x + center[1] * l.y + center[2] * l.z;
            double r = h[0] * std::fabs(l.x) + h[1] * std::fabs(l.y) + h[2] * std::fabs(l.z);
            if (normalMin_ - c > r || normalMax_ - c < -r) return false;
        }
        return true;
    }

private:
    // The three axes (unit axis crossed with each edge) of one unit axis: components p and q
    // along the box axes u and w, and the triangle's extent along each. The fourth lane is
    // zero throughout and never separates.
    struct CrossAxes {
        int u = 0, w = 0;
        alignas(16) double p[4], q[4], absP[4], absQ[4], min[4], max[4];
    };
    int groups_ = 0;
    float lo_[3], hi_[3];
    CrossAxes cross_[3];
    D3 normal_{0, 0, 0};
    double normalMin_ = 0, normalMax_ = 0;
};

// Interleaves the low 21 bits of x, y and z.
uint64_t morton3x21(uint64_t x, uint64_t y, uint64_t z) {
    auto spread = [](uint64_t v) {
        v &= 0x1FFFFF;
        v = (v | v << 32) & 0x1F00000000FFFFull;
        v = (v | v << 16) & 0x1F0000FF0000FFull;
        v = (v | v << 8) & 0x100F00F00F00F00Full;
        v = (v | v << 4) & 0x10C30C30C30C30C3ull;
        v = (v | v << 2) & 0x1249249249249249ull;
        return v;
    };
    return spread(x) | spread(y) << 1 | spread(z) << 2;
}

// Interleaves the low ten bits of x, y and z.
uint32_t morton3(uint32_t x, uint32_t y, uint32_t z) {
    auto spread = [](uint32_t v) {
        v &= 0x3FF;
        v = (v | (v << 16)) & 0x030000FF;
        v = (v | (v << 8)) & 0x0300F00F;
        v = (v | (v << 4)) & 0x030C30C3;
        v = (v | (v << 2)) & 0x09249249;
        return v;
    };
    return spread(x) | (spread(y) << 1) | (spread(z) << 2);
}

std::string boxText(const BBox &b) {
    char buf[256];
    std::snprintf(buf, sizeof buf, "min (%g, %g, %g) max (%g, %g, %g)", b.min.x, b.min.y, b.min.z,
                  b.max.x, b.max.y, b.max.z);
    return buf;
}

}  // namespace

BBox PrimitiveStore::bounds(uint32_t code) const {
    uint32_t index = code & kItemIndexMask;
    switch (code >> kItemIndexBits) {
        case kItemTriangle:
            return triangles[index].bounds();
        case kItemMotion:
            return motion[index].box;
        case kItemInstance:
            return instances[index].box;
        default:
            return BBox();
    }
}

namespace {

// IntersectTriangle::bounds, written out so that it is inlined in the build's loops (the first
// of equal values, as std::min and std::max over a list take it).
inline BBox boxOf(const IntersectTriangle &t) {
    const Vec3 p1 = t.p0 + t.e1, p2 = t.p0 + t.e2;
    auto least = [](float a, float b, float c) {
        float m = a;
        if (b < m) m = b;
        if (c < m) m = c;
        return m;
    };
    auto most = [](float a, float b, float c) {
        float m = a;
        if (m < b) m = b;
        if (m < c) m = c;
        return m;
    };
    return {{least(t.p0.x, p1.x, p2.x), least(t.p0.y, p1.y, p2.y), least(t.p0.z, p1.z, p2.z)},
            {most(t.p0.x, p1.x, p2.x), most(t.p0.y, p1.y, p2.y), most(t.p0.z, p1.z, p2.z)}};
}

// box.extend(b) for finite boxes, without the library calls: on equal values the same one as
// fmin and fmax keep.
void growBox(BBox &box, const BBox &b) {
    box.min = {box.min.x < b.min.x ? box.min.x : b.min.x, box.min.y < b.min.y ? box.min.y : b.min.y,
               box.min.z < b.min.z ? box.min.z : b.min.z};
    box.max = {box.max.x > b.max.x ? box.max.x : b.max.x, box.max.y > b.max.y ? box.max.y : b.max.y,
               box.max.z > b.max.z ? box.max.z : b.max.z};
}

}  // namespace

BBox PrimitiveStore::boundsOf(const std::vector<uint32_t> &codes) const {
    BBox box;
    for (uint32_t code : codes)
        growBox(box, (code >> kItemIndexBits) == kItemTriangle
                         ? boxOf(triangles[code & kItemIndexMask])
                         : bounds(code));
    return box;
}

size_t PrimitiveStore::sizeBytes() const {
    return triangles.capacity() * sizeof(IntersectTriangle) +
           motion.capacity() * sizeof(MotionTriangle) + motionCorners.capacity() * sizeof(Vec3) +
           instances.capacity() * sizeof(IntersectInstanceGrid);
}

void PrimitiveStore::sortForPackets(std::vector<uint32_t> &codes, float density) {
    size_t n = triangles.size();
    if (n < 2) return;
    BBox box;
    for (const IntersectTriangle &t : triangles) growBox(box, boxOf(t));
    if (!Grid::boxUsable(box)) return;
    box = Grid::widen(box);
    Vec3 ext = box.extent();
    GridResolution res = Grid::resolution(n, ext.x, ext.y, ext.z, density);
    const double cells[3] = {double(res.nx), double(res.ny), double(res.nz)};
    // Order: the triangle's home cell (the cell of its box's lower corner) along the curve;
    // inside one, the triangles that reach into the same neighbours together, then the curve
    // over the centres. Neighbouring triangles share packets, a packet rarely spans two cells,
    // and a neighbour that a few of a cell's triangles reach finds them in few packets.
    // Sort keys: the home cell's curve position, the reach bits (above the triangle's index,
    // which stays below 2^29) and the curve position inside the cell.
    struct Keyed {
        uint64_t cell;
        uint32_t inside, reachAndTri;
    };
    // Position in cell units along an axis, clamped (NaN to 0) before any integer conversion.
    const double scale[3] = {ext.x > 0.0f ? cells[0] / ext.x : 0.0,
                             ext.y > 0.0f ? cells[1] / ext.y : 0.0,
                             ext.z > 0.0f ? cells[2] / ext.z : 0.0};
    auto unit = [&](float v, int a) {
        double f = (double(v) - box.min[a]) * scale[a];
        return f >= 0.0 ? (f < cells[a] ? f : cells[a] - 0.5) : 0.0;
    };
    std::vector<Keyed> keyed(n), spare(n);
    uint64_t cellBits = 0;
    for (size_t i = 0; i < n; ++i) {
        const IntersectTriangle &t = triangles[i];
        Vec3 centre = t.p0 + (t.e1 + t.e2) * (1.0f / 3.0f);
        BBox b = boxOf(t);
        uint64_t c[3];
        uint32_t q[3], reach = 0;
        for (int a = 0; a < 3; ++a) {
            c[a] = uint64_t(unit(b.min[a], a));
            double f = unit(centre[a], a) - double(c[a]);
            q[a] = uint32_t(std::min(f, 1.0) * 1023.0);
            reach |= uint32_t(uint64_t(unit(b.max[a], a)) > c[a]) << a;
        }
        keyed[i] = {morton3x21(c[0], c[1], c[2]), morton3(q[0], q[1], q[2]),
                    reach << kItemIndexBits | uint32_t(i)};
        cellBits |= keyed[i].cell;
    }
    // Stable radix sort from triangle order, least significant digit first (ties keep the
    // earlier triangle first): the 30 bits inside, the 3 reach bits, the cell bits in use.
    struct Digit {
        int word, shift, bits;
    };
    std::vector<Digit> digits = {{0, 0, 10}, {0, 10, 10}, {0, 20, 10}, {1, kItemIndexBits, 3}};
    for (int shift = 0; shift < int(std::bit_width(cellBits)); shift += 11)
        digits.push_back({2, shift, 11});
    std::vector<uint32_t> count(size_t(1) << 11);
    auto pass = [&](const Digit &d, auto word) {
        auto digit = [&](const Keyed &k) {
            return uint32_t(uint64_t(word(k)) >> d.shift) & ((1u << d.bits) - 1u);
        };
        std::fill(count.begin(), count.end(), 0u);
        for (const Keyed &k : keyed) ++count[digit(k)];
        if (count[digit(keyed[0])] == n) return;  // one bucket: the order stays
        uint32_t sum = 0;
        for (uint32_t &c : count) sum += std::exchange(c, sum);
        for (const Keyed &k : keyed) spare[count[digit(k)]++] = k;
        keyed.swap(spare);
    };
    for (const Digit &d : digits) {
        if (d.word == 0)
            pass(d, [](const Keyed &k) { return k.inside; });
        else if (d.word == 1)
            pass(d, [](const Keyed &k) { return k.reachAndTri; });
        else
            pass(d, [](const Keyed &k) { return k.cell; });
    }
    // Gather into a second store: its reads are independent, so their misses overlap.
    std::vector<uint32_t> newIndex(n);
    decltype(triangles) sorted(n);
    for (size_t i = 0; i < n; ++i) {
        if (i + 8 < n) __builtin_prefetch(&triangles[keyed[i + 8].reachAndTri & kItemIndexMask]);
        uint32_t tri = keyed[i].reachAndTri & kItemIndexMask;
        sorted[i] = triangles[tri];
        newIndex[tri] = uint32_t(i);
    }
    triangles.swap(sorted);
    // The renamed triangle codes go back in ascending order into the places that held triangle
    // codes (other codes keep theirs): a cell then lists its triangles in store order.
    std::vector<uint32_t> uses(n, 0);
    for (uint32_t code : codes)
        if ((code >> kItemIndexBits) == kItemTriangle) ++uses[newIndex[code & kItemIndexMask]];
    size_t next = 0;
    for (uint32_t &code : codes)
        if ((code >> kItemIndexBits) == kItemTriangle) {
            while (!uses[next]) ++next;
            --uses[next];
            code = itemCode(kItemTriangle, uint32_t(next));
        }
}

BBox Grid::widen(const BBox &box) {
    BBox out;
    for (int a = 0; a < 3; ++a) {
        float c = 0.5f * (box.min[a] + box.max[a]);
        float extent = box.max[a] - box.min[a];
        float h = 0.5f * extent * 1.001f;
        if (extent < 0.0015f) h += 0.0015f;
        out.min[a] = c - h;
        out.max[a] = c + h;
    }
    return out;
}

bool Grid::boxUsable(const BBox &box) {
    for (int a = 0; a < 3; ++a) {
        float extent = box.max[a] - box.min[a];
        if (!std::isfinite(extent) || !(extent >= 0.0f)) return false;
    }
    return true;
}

GridResolution Grid::resolution(uint64_t n, double dx, double dy, double dz, float density) {
    GridResolution r;
    if (n == 0) return r;
    double dens = (density > 0.0f && std::isfinite(density)) ? double(density) : 1.0;
    double limit = std::min(8.0 * double(n), kMaxCells);
    double t = std::min(double(n) * dens, limit);
    double nz = std::ceil(std::cbrt(t * dz * dz / (dx * dy)));
    auto clampAxis = [&](double v) {
        if (!std::isfinite(v) || v < 1.0) return 1.0;
        return std::min(v, limit);
    };
    nz = clampAxis(nz);
    double ny = clampAxis(std::ceil(std::sqrt(t * dy / (dx * nz))));
    double nx = clampAxis(std::ceil(t / (ny * nz)));
    // Bound the total: shrink all axes together until the product fits.
    while (nx * ny * nz > limit) {
        double f = std::cbrt(limit / (nx * ny * nz));
        double nnx = std::max(1.0, std::floor(nx * f)), nny = std::max(1.0, std::floor(ny * f)),
               nnz = std::max(1.0, std::floor(nz * f));
        if (nnx == nx && nny == ny && nnz == nz) {
            // Rounding kept the product; take one cell from the largest axis.
            double &m = nx >= ny && nx >= nz ? nnx : (ny >= nz ? nny : nnz);
            m = std::max(1.0, m - 1.0);
        }
        nx = nnx, ny = nny, nz = nnz;
    }
    r.nx = int64_t(nx), r.ny = int64_t(ny), r.nz = int64_t(nz);
    return r;
}

bool Grid::build(const PrimitiveStore &store, const std::vector<uint32_t> &prims, const BBox &box,
                 const GridParams &params, uint32_t depth, bool widenBox) {
    if (!prepare(store, prims, box, params, depth, widenBox)) return false;
    if (nx_ > 0) refine();
    return true;
}

bool Grid::prepare(const PrimitiveStore &store, const std::vector<uint32_t> &prims, const BBox &box,
                   const GridParams &params, uint32_t depth, bool widenBox) {
    store_ = &store;
    params_ = params;
    params_.maxDepth = std::min(params.maxDepth, kMaxDepthLimit);
    depth_ = depth;
    cells_.clear();
    items_.clear();
    groups_.clear();
    children_.clear();
    stats_ = GridStats();
    nx_ = ny_ = nz_ = 0;
    box_ = BBox(Vec3(), Vec3());
    if (prims.empty()) return true;
    if (!boxUsable(box)) {
        message(kMsgError, 1, "Scene Bounding Box is broken, not rendering (%s)\n",
                boxText(box).c_str());
        return false;
    }
    BBox b = widenBox ? widen(box) : box;
    if (!boxUsable(b)) {
        message(kMsgError, 1, "Scene Bounding Box is broken, not rendering (%s)\n",
                boxText(box).c_str());
        return false;
    }
    Vec3 ext = b.extent();
    if (!(ext.x > 0.0f && ext.y > 0.0f && ext.z > 0.0f)) {
        // A nested grid over a flat cell cannot be subdivided meaningfully; the caller keeps the
        // cell's list (the top-level box is always widened and never lands here).
        return false;
    }
    box_ = b;
    GridResolution res = resolution(prims.size(), ext.x, ext.y, ext.z, params.density);
    nx_ = res.nx, ny_ = res.ny, nz_ = res.nz;
    cellSize_ = {ext.x / float(nx_), ext.y / float(ny_), ext.z / float(nz_)};
    invCellSize_ = {float(nx_) / ext.x, float(ny_) / ext.y, float(nz_) / ext.z};
    // Cell counts and strides fit 32 bits: the total is bounded by 2^28.
    walk_.lo = _mm_setr_ps(b.min.x, b.min.y, b.min.z, 0.0f);
    walk_.size = _mm_setr_ps(cellSize_.x, cellSize_.y, cellSize_.z, 0.0f);
    walk_.invSize = _mm_setr_ps(invCellSize_.x, invCellSize_.y, invCellSize_.z, 0.0f);
    walk_.top = _mm_setr_ps(float(nx_ - 1), float(ny_ - 1), float(nz_ - 1), 0.0f);
    walk_.last = _mm_setr_epi32(int32_t(nx_ - 1), int32_t(ny_ - 1), int32_t(nz_ - 1), 0);
    walk_.stride = _mm_setr_epi32(1, int32_t(nx_), int32_t(nx_ * ny_), 0);
    const float lo[3] = {b.min.x, b.min.y, b.min.z};
    const float invSize[3] = {invCellSize_.x, invCellSize_.y, invCellSize_.z};
    const int64_t n[3] = {nx_, ny_, nz_};
    for (int a = 0; a < 3; ++a) {
        fetch_.lo[a] = float4(lo[a]);
        fetch_.invSize[a] = float4(invSize[a]);
        fetch_.top[a] = float4(float(n[a] - 1));
    }
    fetch_.strideY = float4(float(nx_));
    fetch_.strideZ = float4(float(nx_ * ny_));
    const int64_t lastCell = nx_ * ny_ * nz_ - 1;
    float lastF = float(lastCell);
    if (double(lastF) > double(lastCell)) lastF = std::nextafter(lastF, 0.0f);
    fetch_.lastCell = float4(lastF);
    tolerance_ = std::max(0.001f, 1e-5f * cellSize_.length());
    // Cells take their primitives with a small margin, so that a ray walking next to a cell
    // boundary finds a triangle that only touches the neighbouring cell. The tolerance, bounded
    // by a twentieth of the smallest cell, plus the float resolution of the coordinates.
    float maxAbs = std::max({std::fabs(b.min.x), std::fabs(b.min.y), std::fabs(b.min.z),
                             std::fabs(b.max.x), std::fabs(b.max.y), std::fabs(b.max.z)});
    float minCell = std::min({cellSize_.x, cellSize_.y, cellSize_.z});
    margin_ = std::min(tolerance_, 0.01f * minCell) + 4e-7f * maxAbs;
    // Group boxes are padded by the margin plus a thousandth of the cell diagonal against
    // rounding in the slab test; their frames leave room for twice that.
    framePad_ = 2.0f * (margin_ + 1e-3f * cellSize_.length());
    frameStep_ =
        (cellSize_ + Vec3(2.0f * framePad_, 2.0f * framePad_, 2.0f * framePad_)) * (1.0f / 255.0f);
    insertAll(prims);
    return true;
}

BBox Grid::cellBox(int64_t x, int64_t y, int64_t z) const {
    BBox c;
    c.min = {box_.min.x + float(x) * cellSize_.x, box_.min.y + float(y) * cellSize_.y,
             box_.min.z + float(z) * cellSize_.z};
    c.max = {x + 1 == nx_ ? box_.max.x : box_.min.x + float(x + 1) * cellSize_.x,
             y + 1 == ny_ ? box_.max.y : box_.min.y + float(y + 1) * cellSize_.y,
             z + 1 == nz_ ? box_.max.z : box_.min.z + float(z + 1) * cellSize_.z};
    return c;
}

void Grid::insertAll(const std::vector<uint32_t> &prims) {
    size_t ncells = size_t(nx_ * ny_ * nz_);
    std::vector<std::pair<uint32_t, uint32_t>> pairs;
    pairs.reserve(prims.size() * 2);
    const int64_t n[3] = {nx_, ny_, nz_};
    const float lower[3] = {box_.min.x, box_.min.y, box_.min.z};
    const float upper[3] = {box_.max.x, box_.max.y, box_.max.z};
    const float size[3] = {cellSize_.x, cellSize_.y, cellSize_.z};
    const float inverse[3] = {invCellSize_.x, invCellSize_.y, invCellSize_.z};
    // cellCoord, and the bounds of cellBox grown by the margin, along one axis.
    auto coord = [&](float v, int a) {
        float f = (v - lower[a]) * inverse[a];
        f = f >= 0.0f ? (f < float(n[a] - 1) ? f : float(n[a] - 1)) : 0.0f;
        return std::min(int64_t(f), n[a] - 1);
    };
    auto grownMin = [&](int a, int64_t i) { return lower[a] + float(i) * size[a] - margin_; };
    auto grownMax = [&](int a, int64_t i) {
        return (i + 1 == n[a] ? upper[a] : lower[a] + float(i + 1) * size[a]) + margin_;
    };
    for (uint32_t code : prims) {
        const bool triangle = (code >> kItemIndexBits) == kItemTriangle;
        const IntersectTriangle *t = triangle ? &store_->triangles[code & kItemIndexMask] : nullptr;
        const BBox b = triangle ? boxOf(*t) : store_->bounds(code);
        int64_t lo[3], hi[3];
        for (int a = 0; a < 3; ++a) {
            lo[a] = coord(b.min[a] - margin_, a);
            hi[a] = coord(b.max[a] + margin_, a);
        }
        if (lo[0] == hi[0] && lo[1] == hi[1] && lo[2] == hi[2]) {
            pairs.emplace_back(uint32_t((lo[2] * ny_ + lo[1]) * nx_ + lo[0]), code);
            continue;
        }
        // Each covered cell, grown by the margin, is tested against the primitive (a triangle
        // exactly, anything else by its box). Axes along which a triangle lies inside its one
        // row of cells cannot separate.
        uint32_t free = 7;
        if (triangle)
            for (int a = 0; a < 3; ++a)
                if (lo[a] == hi[a] && grownMin(a, lo[a]) <= b.min[a] &&
                    b.max[a] <= grownMax(a, lo[a]))
                    free &= ~(1u << a);
        const TriangleBoxTest test =
            triangle ? TriangleBoxTest(t->p0, t->p0 + t->e1, t->p0 + t->e2, free)
                     : TriangleBoxTest(b);
        BBox cell;
        for (int64_t z = lo[2]; z <= hi[2]; ++z) {
            cell.min.z = grownMin(2, z), cell.max.z = grownMax(2, z);
            for (int64_t y = lo[1]; y <= hi[1]; ++y) {
                cell.min.y = grownMin(1, y), cell.max.y = grownMax(1, y);
                for (int64_t x = lo[0]; x <= hi[0]; ++x) {
                    cell.min.x = grownMin(0, x), cell.max.x = grownMax(0, x);
                    if (test.overlaps(cell))
                        pairs.emplace_back(uint32_t((z * ny_ + y) * nx_ + x), code);
                }
            }
        }
    }
    // Cell lists are indexed with 32 bits.
    if (pairs.size() > 0xFFFFFFFFull) throw std::length_error("too many cell references");
    buildBegin_.assign(ncells + 1, 0);
    for (const auto &p : pairs) ++buildBegin_[p.first + 1];
    for (size_t i = 0; i < ncells; ++i) buildBegin_[i + 1] += buildBegin_[i];
    buildItems_.resize(pairs.size());
    std::vector<uint32_t> fill(buildBegin_.begin(), buildBegin_.end() - 1);
    for (const auto &p : pairs) buildItems_[fill[p.first]++] = p.second;
    refinedChild_.clear();
}

void Grid::refine() {
    size_t ncells = size_t(nx_ * ny_ * nz_);
    refinedChild_.assign(ncells, 0xFFFFFFFFu);
    if (depth_ < params_.maxDepth) {
        uint64_t limit = params_.sse ? 4ull * params_.threshold : params_.threshold;
        for (int64_t z = 0; z < nz_; ++z)
            for (int64_t y = 0; y < ny_; ++y)
                for (int64_t x = 0; x < nx_; ++x) {
                    size_t c = size_t((z * ny_ + y) * nx_ + x);
                    if (refinedChild_[c] != 0xFFFFFFFFu) continue;
                    uint32_t count = buildBegin_[c + 1] - buildBegin_[c];
                    if (count <= limit) continue;
                    std::vector<uint32_t> cellPrims(buildItems_.begin() + buildBegin_[c],
                                                    buildItems_.begin() + buildBegin_[c + 1]);
                    auto child = std::make_unique<Grid>();
                    if (!child->prepare(*store_, cellPrims, cellBox(x, y, z), params_, depth_ + 1,
                                        false))
                        continue;
                    uint64_t occupied = 0, refs = 0;
                    size_t childCells = size_t(child->nx_ * child->ny_ * child->nz_);
                    for (size_t i = 0; i < childCells; ++i) {
                        uint32_t k = child->buildBegin_[i + 1] - child->buildBegin_[i];
                        refs += k;
                        occupied += k != 0;
                    }
                    uint64_t average = occupied ? refs / occupied : 0;
                    if (double(average) > double(count) / 4.0) continue;
                    child->refine();
                    refinedChild_[c] = uint32_t(children_.size());
                    children_.push_back(std::move(child));
                }
    }
    finalize();
}

void Grid::finalize() {
    size_t ncells = size_t(nx_ * ny_ * nz_);
    if (refinedChild_.size() != ncells) refinedChild_.assign(ncells, 0xFFFFFFFFu);
    std::vector<uint32_t> cellBegin(ncells + 1, 0);
    items_.clear();
    groups_.clear();
    stats_ = GridStats();
    stats_.voxels = ncells;
    std::vector<uint32_t> tris, others;
    GroupScratch scratch;
    for (size_t c = 0; c < ncells; ++c) {
        cellBegin[c] = uint32_t(items_.size());
        uint64_t elements = 0;
        if (refinedChild_[c] != 0xFFFFFFFFu) {
            items_.push_back(itemCode(kItemChild, refinedChild_[c]));
            elements = 1;
        } else {
            tris.clear();
            others.clear();
            for (uint32_t k = buildBegin_[c]; k < buildBegin_[c + 1]; ++k) {
                uint32_t code = buildItems_[k];
                ++elements;
                if (params_.sse && (code >> kItemIndexBits) == kItemTriangle)
                    tris.push_back(code & kItemIndexMask);
                else
                    others.push_back(code);
            }
            if (!tris.empty()) {
                int64_t z = int64_t(c / size_t(nx_ * ny_)), rem = int64_t(c % size_t(nx_ * ny_));
                groupCell(tris, rem % nx_, rem / nx_, z, scratch);
            }
            items_.insert(items_.end(), others.begin(), others.end());
        }
        stats_.occupied += elements != 0;
        stats_.elements += elements;
        stats_.maxElements = std::max(stats_.maxElements, elements);
    }
    cellBegin[ncells] = uint32_t(items_.size());
    cells_.assign(ncells, 0u);
    decltype(items_) lists;
    for (size_t c = 0; c < ncells; ++c) {
        uint32_t count = cellBegin[c + 1] - cellBegin[c];
        if (!count) continue;
        if (count == 1) {
            cells_[c] = items_[cellBegin[c]];
        } else {
            // List offsets share the 29 index bits of item codes.
            if (lists.size() > kItemIndexMask) throw std::length_error("too many cell references");
            cells_[c] = itemCode(kItemList, uint32_t(lists.size()));
            lists.push_back(count);
            lists.insert(lists.end(), items_.begin() + cellBegin[c],
                         items_.begin() + cellBegin[c + 1]);
        }
    }
    std::vector<uint8_t> occupied(cellBegin.size() - 1);
    for (size_t c = 0; c < ncells; ++c) occupied[c] = cellBegin[c + 1] != cellBegin[c];
    items_.swap(lists);
    computeDistances(occupied);
    items_.shrink_to_fit();
    groups_.shrink_to_fit();
    std::vector<uint32_t>().swap(buildBegin_);
    std::vector<uint32_t>().swap(buildItems_);
    std::vector<uint32_t>().swap(refinedChild_);
}

void Grid::groupCell(std::vector<uint32_t> &tris, int64_t x, int64_t y, int64_t z,
                     GroupScratch &scratch) {
    // The packets holding the cell's triangles, each with the box of those triangles (packet k
    // holds triangles 4k to 4k + 3, so triangle order is packet order).
    if (!std::is_sorted(tris.begin(), tris.end())) std::sort(tris.begin(), tris.end());
    auto &used = scratch.used;
    used.clear();
    for (uint32_t t : tris) {
        const uint32_t p = t >> 2;
        const BBox tb = boxOf(store_->triangles[t]);
        if (used.empty() || used.back().first != p) {
            used.emplace_back(p, tb);
        } else {
            BBox &b = used.back().second;
            b.min = {std::min(b.min.x, tb.min.x), std::min(b.min.y, tb.min.y),
                     std::min(b.min.z, tb.min.z)};
            b.max = {std::max(b.max.x, tb.max.x), std::max(b.max.y, tb.max.y),
                     std::max(b.max.z, tb.max.z)};
        }
    }
    // Groups address packets with 29 bits; a structure that large keeps the remaining
    // triangles unpacked (the same test, one triangle at a time).
    size_t groupCount = (used.size() + 3) / 4;
    if (groups_.size() + groupCount > kMaxItemIndex) {
        for (uint32_t t : tris) items_.push_back(itemCode(kItemTriangle, t));
        return;
    }
    if (used.size() == 1) {
        items_.push_back(itemCode(kItemPacket, used[0].first));
        return;
    }
    // Boxes are clipped to the cell (a hit is always found in the cell that holds its point)
    // and padded beyond the cell margin against rounding in the slab test, then stored in
    // steps of the cell's frame, rounded outwards by one step more (the frame holds the clip
    // box, so clamping to it keeps every box whole).
    const BBox cell = cellBox(x, y, z);
    const float pad = 0.5f * framePad_;
    const Vec3 frame = frameOrigin(x, y, z);
    auto quantise = [&](float v, int a, bool up) {
        double q = (double(v) - double(frame[a])) / double(frameStep_[a]);
        // Far outside the frame (or NaN) the step clamps to its end; inside, floor and ceiling
        // through the integer part.
        if (!(q > -8.0)) return uint8_t(0);
        if (q > 264.0) return uint8_t(255);
        const double whole = double(int32_t(q));
        q = up ? whole + double(whole < q) + 1.0 : whole - double(whole > q) - 1.0;
        return uint8_t(q >= 0.0 ? (q <= 255.0 ? q : 255.0) : 0.0);
    };
    uint32_t first = uint32_t(groups_.size());
    for (size_t g = 0; g < groupCount; ++g) {
        PacketGroup group;
        const uint32_t count = uint32_t(std::min<size_t>(4, used.size() - 4 * g));
        group.lanes = (1u << count) - 1u;
        group.run = uint32_t(groupCount - g);
        for (uint32_t j = 0; j < 4; ++j) {
            const auto &[p, b] = used[4 * g + std::min(j, count - 1)];
            for (int a = 0; a < 3; ++a) {
                group.lo[a][j] = quantise(std::max(b.min[a] - pad, cell.min[a] - pad), a, false);
                group.hi[a][j] = quantise(std::min(b.max[a] + pad, cell.max[a] + pad), a, true);
            }
            group.packet[j] = p;
        }
        groups_.push_back(group);
    }
    items_.push_back(itemCode(kItemGroup, first));
}

namespace {

// out[i] = min(a[i], b[i], c[i]) for i < n, sixteen at a time.
void minOfRows(const uint8_t *a, const uint8_t *b, const uint8_t *c, uint8_t *out, size_t n) {
    size_t i = 0;
    for (; i + 16 <= n; i += 16) {
        auto load = [&](const uint8_t *p) {
            return _mm_loadu_si128(reinterpret_cast<const __m128i *>(p + i));
        };
        _mm_storeu_si128(reinterpret_cast<__m128i *>(out + i),
                         _mm_min_epu8(_mm_min_epu8(load(a), load(b)), load(c)));
    }
    if (n >= 16 && i < n) {
        // The rest as one more block ending at n (out is none of the inputs).
        i = n - 16;
        auto load = [&](const uint8_t *p) {
            return _mm_loadu_si128(reinterpret_cast<const __m128i *>(p + i));
        };
        _mm_storeu_si128(reinterpret_cast<__m128i *>(out + i),
                         _mm_min_epu8(_mm_min_epu8(load(a), load(b)), load(c)));
        return;
    }
    for (; i < n; ++i) out[i] = std::min({a[i], b[i], c[i]});
}

}  // namespace

void Grid::computeDistances(const std::vector<uint8_t> &occupied) {
    // Per direction octant (signs of the ray direction), the side of the largest empty cube that
    // starts at the cell and extends the way the ray goes; cells beyond the grid count as empty.
    // One pass per octant against its direction: each cell takes one more than the smallest of
    // its seven neighbours ahead, or kEmptyAhead when every cell ahead of it (the whole octant
    // of cells whose coordinates lie on the ray's side) is empty.
    size_t ncells = occupied.size();
    constexpr uint32_t kAhead = 255;
    std::vector<uint8_t> distance(8 * ncells, kAhead);
    const int64_t n[3] = {nx_, ny_, nz_};
    for (int octant = 0; octant < 8; ++octant) {
        uint8_t *d = distance.data() + size_t(octant) * ncells;
        int64_t s[3], start[3];
        for (int a = 0; a < 3; ++a) {
            s[a] = (octant >> a & 1) ? -1 : 1;
            start[a] = s[a] > 0 ? n[a] - 1 : 0;
        }
        // Row by row: first the smallest of the six neighbours in the rows ahead (y, z or both
        // one on), at x and at x one on, over the whole row at once (the smallest of the three
        // rows, then of it and its neighbour along the ray); then along the row against its
        // direction, the neighbour ahead in the row itself.
        std::vector<uint8_t> three(static_cast<size_t>(nx_)), ahead(static_cast<size_t>(nx_));
        std::vector<uint8_t> none(static_cast<size_t>(nx_), static_cast<uint8_t>(kAhead));
        const int64_t sx = s[0];
        const size_t rowLength = size_t(nx_);
        for (int64_t z = start[2]; z >= 0 && z < nz_; z -= s[2])
            for (int64_t y = start[1]; y >= 0 && y < ny_; y -= s[1]) {
                const bool inY = y + s[1] >= 0 && y + s[1] < ny_;
                const bool inZ = z + s[2] >= 0 && z + s[2] < nz_;
                auto row = [&](int64_t yy, int64_t zz) {
                    return d + size_t((zz * ny_ + yy) * nx_);
                };
                const uint8_t *rows[3] = {inY ? row(y + s[1], z) : none.data(),
                                          inZ ? row(y, z + s[2]) : none.data(),
                                          inY && inZ ? row(y + s[1], z + s[2]) : none.data()};
                uint8_t *t = three.data(), *m = ahead.data();
                minOfRows(rows[0], rows[1], rows[2], t, rowLength);
                // x one on along the ray (none beyond the row's end).
                if (sx > 0) {
                    minOfRows(t, t + 1, t + 1, m, rowLength - 1);
                    m[rowLength - 1] = t[rowLength - 1];
                } else {
                    m[0] = t[0];
                    minOfRows(t + 1, t, t, m + 1, rowLength - 1);
                }
                uint8_t *out = row(y, z);
                const uint8_t *occ = occupied.data() + size_t((z * ny_ + y) * nx_);
                uint32_t prev = kAhead;  // the cell ahead in the row
                for (int64_t x = start[0]; x >= 0 && x < nx_; x -= sx) {
                    uint32_t best = std::min<uint32_t>(prev, m[x]);
                    uint32_t v =
                        occ[x]
                            ? 0u
                            : (best == kAhead ? kAhead : std::min<uint32_t>(best + 1, kAhead - 1));
                    out[x] = uint8_t(v);
                    prev = v;
                }
            }
    }
    // Empty cells' words: each octant's side rounded down to a coded one.
    uint8_t codeOf[256];
    for (uint32_t side = 0; side < 256; ++side) {
        uint32_t code = kEmptyAhead;
        if (side != kAhead) {
            code = 0;
            while (code + 1 < kEmptyAhead && kCubeSide[code + 1] <= side) ++code;
        }
        codeOf[side] = uint8_t(code);
    }
    for (size_t c = 0; c < ncells; ++c) {
        if (occupied[c]) continue;
        uint32_t word = 0;
        for (int octant = 0; octant < 8; ++octant)
            word |= uint32_t(codeOf[distance[size_t(octant) * ncells + c]]) << (3 * octant);
        cells_[c] = itemCode(kItemEmpty, word);
    }
}

size_t Grid::nestedGridCount() const {
    size_t n = children_.size();
    for (const auto &c : children_) n += c->nestedGridCount();
    return n;
}

uint32_t Grid::nestingDepth() const {
    uint32_t d = 0;
    for (const auto &c : children_) d = std::max(d, 1 + c->nestingDepth());
    return d;
}

size_t Grid::sizeBytes() const {
    size_t n = sizeof(Grid) + cells_.capacity() * sizeof(uint32_t) + items_.capacity() * 4 +
               groups_.capacity() * sizeof(PacketGroup) + children_.capacity() * sizeof(void *);
    for (const auto &c : children_) n += c->sizeBytes();
    return n;
}

std::vector<uint32_t> Grid::cellItems(int64_t x, int64_t y, int64_t z) const {
    if (empty() || x < 0 || y < 0 || z < 0 || x >= nx_ || y >= ny_ || z >= nz_) return {};
    size_t c = size_t((z * ny_ + y) * nx_ + x);
    uint32_t word = cells_[c];
    if ((word >> kItemIndexBits) == kItemEmpty) return {};
    if ((word >> kItemIndexBits) != kItemList) return {word};
    const uint32_t *list = items_.data() + (word & kItemIndexMask);
    return {list + 1, list + 1 + list[0]};
}

bool instanceRay(const IntersectInstanceGrid &inst, const TraceRay &world, TraceRay &local) {
    const Mtx4 &m = inst.worldToObject;
    Vec3 o = affinePoint(m, world.o);
    Vec3 d = m.transformVector(world.d);
    if (!local.prepare(o, d, world.required, world.time)) return false;
    local.setInstanceFlags(inst.testFlags);
    return true;
}

namespace {

constexpr float kInfinity = std::numeric_limits<float>::infinity();

// Runs the packet kernel on packet k of the store and keeps the closest lane hit in the state.
// The last packet of a store whose size is not a multiple of four is completed with lanes that
// never hit.
template <bool kAny>
__attribute__((always_inline)) inline bool testPacket(const PrimitiveStore &store, uint32_t k,
                                                      const TraceRay &r, TraceState &s) {
    const IntersectTriangle *tri = store.triangles.data() + size_t(k) * 4;
    IntersectSSETriangle pk;
    size_t left = store.triangles.size() - size_t(k) * 4;
    if (__builtin_expect(left >= 4, 1)) {
        pk = IntersectSSETriangle::load(tri);
    } else {
        alignas(16) IntersectTriangle last[4];
        const float nan = std::numeric_limits<float>::quiet_NaN();
        for (size_t i = 0; i < 4; ++i) {
            if (i < left) {
                last[i] = tri[i];
            } else {
                last[i].p0 = Vec3(nan, nan, nan);
                last[i].flags = 0;
            }
        }
        pk = IntersectSSETriangle::load(last);
    }
    float4 t, u, v;
    const float4 lanes = intersectPacketLanes(pk, r, s.limit, t, u, v);
    const int mask = movemask(lanes);
    if (!mask) return false;
    if constexpr (kAny) return true;
    // The nearest hit lane (of equally near ones the lowest), without a branch per lane.
    const __m128 near =
        _mm_or_ps(_mm_and_ps(lanes, t), _mm_andnot_ps(lanes, _mm_set1_ps(kInfinity)));
    __m128 m = _mm_min_ps(near, _mm_shuffle_ps(near, near, _MM_SHUFFLE(1, 0, 3, 2)));
    m = _mm_min_ps(m, _mm_shuffle_ps(m, m, _MM_SHUFFLE(2, 3, 0, 1)));
    const int lane = __builtin_ctz(_mm_movemask_ps(_mm_cmpeq_ps(near, m)) & mask);
    alignas(16) float us[4], vs[4];
    _mm_store_ps(us, u);
    _mm_store_ps(vs, v);
    s.limit = _mm_cvtss_f32(m);
    s.u = us[lane], s.v = vs[lane];
    s.kind = kItemTriangle;
    s.prim = k * 4 + uint32_t(lane);
    s.found = true;
    return true;
}

// Starts fetching packet k (three cache lines when the store is line-aligned).
inline void prefetchPacket(const PrimitiveStore &store, uint32_t k) {
    const char *p = reinterpret_cast<const char *>(store.triangles.data() + size_t(k) * 4);
    __builtin_prefetch(p);
    __builtin_prefetch(p + 64);
    __builtin_prefetch(p + 128);
}

// Closest-hit queries test the packets of a cell of up to four groups nearest box first: lane
// 4 i + j names packet j of the cell's group i, and the bit of a lane in a candidate mask says
// that the ray passes through its box. The nearest candidate is tested next (of equally near
// ones the lowest lane), until the nearest left is entered beyond the closest hit found. Both
// the four-wide and the eight-wide paths keep this order, so that they report the same hit.
constexpr uint32_t kMaxNearestGroups = 4;

// The order above with the box entry distances of the lanes in tn. Starts fetching every
// candidate's packet first, so that their misses overlap. True when a packet was hit.
__attribute__((always_inline)) inline bool testNearestFirst(const PrimitiveStore &store,
                                                            const PacketGroup *g, const float *tn,
                                                            uint32_t cand, const TraceRay &r,
                                                            TraceState &s) {
    for (uint32_t m = cand; m; m &= m - 1) {
        const uint32_t lane = uint32_t(__builtin_ctz(m));
        prefetchPacket(store, g[lane >> 2].packet[lane & 3]);
    }
    bool hit = false;
    while (cand) {
        uint32_t best = uint32_t(__builtin_ctz(cand));
        for (uint32_t m = cand & (cand - 1); m; m &= m - 1) {
            const uint32_t lane = uint32_t(__builtin_ctz(m));
            if (tn[lane] < tn[best]) best = lane;
        }
        if (!(tn[best] <= s.limit)) break;
        cand &= ~(1u << best);
        if (testPacket<false>(store, g[best >> 2].packet[best & 3], r, s)) hit = true;
    }
    return hit;
}

// Starts fetching the groups of a cell's run from g (most cells have several: the lines of the
// next two are asked for before the first arrives); returns the run's length.
__attribute__((always_inline)) inline uint32_t prefetchGroupRun(const PacketGroup *g) {
    const char *bytes = reinterpret_cast<const char *>(g);
    __builtin_prefetch(bytes);
    __builtin_prefetch(bytes + 64);
    __builtin_prefetch(bytes + 128);
    const uint32_t n = g->run;
    for (uint32_t i = 3; i < n; ++i) __builtin_prefetch(g + i);
    return n;
}

// Lanes of the group whose box the ray passes through between 0 and the limit, and the
// distances at which it enters them. Box planes lie at q * step + frame along each axis: the
// ray meets them at q * a + b with a = step / d and b = (frame - o) / d.
struct GroupFrame {
    float4 ax, ay, az, bx, by, bz;
};

inline int groupMask(const PacketGroup &g, const GroupFrame &f, float limit, float4 &tnear) {
    const __m128i zero = _mm_setzero_si128();
    // lo x, y, z, hi x in the first 16 bytes; hi y, z in the next 8.
    __m128i v0 = _mm_load_si128(reinterpret_cast<const __m128i *>(&g));
    __m128i v1 = _mm_loadl_epi64(reinterpret_cast<const __m128i *>(&g.hi[1][0]));
    __m128i w0 = _mm_unpacklo_epi8(v0, zero), w1 = _mm_unpackhi_epi8(v0, zero);
    __m128i w2 = _mm_unpacklo_epi8(v1, zero);
    auto lanes = [&](__m128i w, bool high) {
        return float4(
            _mm_cvtepi32_ps(high ? _mm_unpackhi_epi16(w, zero) : _mm_unpacklo_epi16(w, zero)));
    };
    float4 t0x = lanes(w0, false) * f.ax + f.bx, t0y = lanes(w0, true) * f.ay + f.by;
    float4 t0z = lanes(w1, false) * f.az + f.bz, t1x = lanes(w1, true) * f.ax + f.bx;
    float4 t1y = lanes(w2, false) * f.ay + f.by, t1z = lanes(w2, true) * f.az + f.bz;
    tnear = _mm_max_ps(_mm_max_ps(_mm_min_ps(t0x, t1x), _mm_min_ps(t0y, t1y)),
                       _mm_max_ps(_mm_min_ps(t0z, t1z), float4::zero()));
    float4 tfar = _mm_min_ps(_mm_min_ps(_mm_max_ps(t0x, t1x), _mm_max_ps(t0y, t1y)),
                             _mm_min_ps(_mm_max_ps(t0z, t1z), float4(limit)));
    return movemask(_mm_cmple_ps(tnear, tfar)) & int(g.lanes);
}

}  // namespace

template <bool kAny>
bool Grid::testGroups(uint32_t index, const TraceRay &r, TraceState &s, const Vec3 &frame) const {
    const PacketGroup *g = groups_.data() + index;
    uint32_t n = prefetchGroupRun(g);
    GroupFrame f;
    f.ax = float4(frameStep_.x) * r.ix, f.ay = float4(frameStep_.y) * r.iy;
    f.az = float4(frameStep_.z) * r.iz;
    f.bx = (float4(frame.x) - r.ox) * r.ix, f.by = (float4(frame.y) - r.oy) * r.iy;
    f.bz = (float4(frame.z) - r.oz) * r.iz;
    bool hit = false;
    if constexpr (!kAny) {
        // Closest hit: the boxes the ray passes through, nearest first; a hit ends the cell's
        // tests at the first box entered beyond it.
        if (n <= kMaxNearestGroups) {
            alignas(16) float tn[4 * kMaxNearestGroups];
            uint32_t cand = 0;
            for (uint32_t i = 0; i < n; ++i) {
                float4 tnear;
                cand |= uint32_t(groupMask(g[i], f, s.limit, tnear)) << (4 * i);
                _mm_store_ps(tn + 4 * i, tnear);
            }
            return testNearestFirst(*store_, g, tn, cand, r, s);
        }
    }
    for (; n > 0; --n, ++g) {
        float4 tnear;
        int mask = groupMask(*g, f, s.limit, tnear);
        // Start fetching every packet the ray may test, so their misses overlap.
        for (int m = mask; m; m &= m - 1) prefetchPacket(*store_, g->packet[__builtin_ctz(m)]);
        while (mask) {
            int lane = __builtin_ctz(mask);
            mask &= mask - 1;
            if (testPacket<kAny>(*store_, g->packet[lane], r, s)) {
                if constexpr (kAny) return true;
                hit = true;
                // Boxes entered beyond the new closest hit cannot hold a closer one.
                mask &= movemask(_mm_cmple_ps(tnear, float4(s.limit)));
            }
        }
    }
    return hit;
}

namespace {

// The eight-wide form of groupMask over two groups (lanes 0-3 the first's packets, 4-7 the
// second's; second = nullptr leaves lanes 4-7 out), with the same operations lane for lane.
struct WideFrame {
    __m256 ax, ay, az, bx, by, bz;
};

// Fetches the run of groups starting at g (the first three lines before its length is read
// from the first), sets n to its length and maps the ray into the cell frame: t = byte * a + b
// per axis.
OX_WIDE_INLINE WideFrame openGroupRun(const PacketGroup *g, uint32_t &n, const Vec3 &step,
                                      const Vec3 &frame, const TraceRay &r) {
    n = prefetchGroupRun(g);
    WideFrame f;
    f.ax = wide_ops::mul(_mm256_set1_ps(step.x), wide(r.ix));
    f.ay = wide_ops::mul(_mm256_set1_ps(step.y), wide(r.iy));
    f.az = wide_ops::mul(_mm256_set1_ps(step.z), wide(r.iz));
    f.bx = wide_ops::mul(wide_ops::sub(_mm256_set1_ps(frame.x), wide(r.ox)), wide(r.ix));
    f.by = wide_ops::mul(wide_ops::sub(_mm256_set1_ps(frame.y), wide(r.oy)), wide(r.iy));
    f.bz = wide_ops::mul(wide_ops::sub(_mm256_set1_ps(frame.z), wide(r.oz)), wide(r.iz));
    return f;
}

OX_WIDE_INLINE __m256 wideBytes(__m128i v, bool high) {
    return _mm256_cvtepi32_ps(_mm256_cvtepu8_epi32(high ? _mm_srli_si128(v, 8) : v));
}

OX_WIDE_INLINE int groupPairMask(const PacketGroup &g0, const PacketGroup *g1, const WideFrame &f,
                                 float limit, __m256 &tnear) {
    using namespace wide_ops;
    const PacketGroup &h = g1 ? *g1 : g0;
    // Per group: lo x, y, z, hi x in the first 16 bytes; hi y, z in the next 8. Interleaved by
    // four bytes, each eight bytes hold one bound of both groups.
    __m128i a0 = _mm_load_si128(reinterpret_cast<const __m128i *>(&g0));
    __m128i a1 = _mm_load_si128(reinterpret_cast<const __m128i *>(&h));
    __m128i b0 = _mm_loadl_epi64(reinterpret_cast<const __m128i *>(&g0.hi[1][0]));
    __m128i b1 = _mm_loadl_epi64(reinterpret_cast<const __m128i *>(&h.hi[1][0]));
    __m128i loXY = _mm_unpacklo_epi32(a0, a1), loZhiX = _mm_unpackhi_epi32(a0, a1);
    __m128i hiYZ = _mm_unpacklo_epi32(b0, b1);
    __m256 t0x = add(mul(wideBytes(loXY, false), f.ax), f.bx);
    __m256 t0y = add(mul(wideBytes(loXY, true), f.ay), f.by);
    __m256 t0z = add(mul(wideBytes(loZhiX, false), f.az), f.bz);
    __m256 t1x = add(mul(wideBytes(loZhiX, true), f.ax), f.bx);
    __m256 t1y = add(mul(wideBytes(hiYZ, false), f.ay), f.by);
    __m256 t1z = add(mul(wideBytes(hiYZ, true), f.az), f.bz);
    tnear = _mm256_max_ps(_mm256_max_ps(_mm256_min_ps(t0x, t1x), _mm256_min_ps(t0y, t1y)),
                          _mm256_max_ps(_mm256_min_ps(t0z, t1z), _mm256_setzero_ps()));
    __m256 tfar = _mm256_min_ps(_mm256_min_ps(_mm256_max_ps(t0x, t1x), _mm256_max_ps(t0y, t1y)),
                                _mm256_min_ps(_mm256_max_ps(t0z, t1z), _mm256_set1_ps(limit)));
    const uint32_t lanes = g0.lanes | (g1 ? g1->lanes : 0u) << 4;
    return _mm256_movemask_ps(_mm256_cmp_ps(tnear, tfar, _CMP_LE_OS)) & int(lanes);
}

// True when packet k0 or k1 holds a hit below the limit. Both are tested together unless one is
// the store's incomplete last packet.
OX_WIDE_INLINE bool packetPairHit(const PrimitiveStore &store, uint32_t k0, uint32_t k1,
                                  const TraceRay &r, TraceState &s) {
    if (__builtin_expect(size_t(std::max(k0, k1)) * 4 + 4 > store.triangles.size(), 0))
        return testPacket<true>(store, k0, r, s) || testPacket<true>(store, k1, r, s);
    const IntersectTriangle *tri = store.triangles.data();
    IntersectWideTriangle pk =
        IntersectWideTriangle::load(tri + size_t(k0) * 4, tri + size_t(k1) * 4);
    __m256 t, u, v;
    return intersectPacketPair(pk, r, s.limit, t, u, v) != 0;
}

}  // namespace

// Closest hit: the groups' boxes two groups at a time, the packets one at a time as testGroups
// tests them (pairs of packets lost more than they gained), so that both give the same hit.
__attribute__((target("avx2"))) bool Grid::closestInGroupsWide(uint32_t index, const TraceRay &r,
                                                               TraceState &s,
                                                               const Vec3 &frame) const {
    using namespace wide_ops;
    const PacketGroup *g = groups_.data() + index;
    uint32_t n;
    const WideFrame f = openGroupRun(g, n, frameStep_, frame, r);
    bool hit = false;
    if (n <= kMaxNearestGroups) {
        alignas(32) float tn[4 * kMaxNearestGroups];
        uint32_t cand = 0;
        for (uint32_t i = 0; i < n; i += 2) {
            __m256 tnear;
            cand |=
                uint32_t(groupPairMask(g[i], i + 1 < n ? g + i + 1 : nullptr, f, s.limit, tnear))
                << (4 * i);
            _mm256_store_ps(tn + 4 * i, tnear);
        }
        return testNearestFirst(*store_, g, tn, cand, r, s);
    }
    for (uint32_t i = 0; i < n; i += 2) {
        const PacketGroup *pair[2] = {g + i, i + 1 < n ? g + i + 1 : nullptr};
        __m256 tnear;
        int mask = groupPairMask(*pair[0], pair[1], f, s.limit, tnear);
        for (int m = mask; m; m &= m - 1) {
            int lane = __builtin_ctz(m);
            prefetchPacket(*store_, pair[lane >> 2]->packet[lane & 3]);
        }
        while (mask) {
            int lane = __builtin_ctz(mask);
            mask &= mask - 1;
            if (testPacket<false>(*store_, pair[lane >> 2]->packet[lane & 3], r, s)) {
                hit = true;
                mask &=
                    _mm256_movemask_ps(_mm256_cmp_ps(tnear, _mm256_set1_ps(s.limit), _CMP_LE_OS));
            }
        }
    }
    return hit;
}

__attribute__((target("avx2"))) bool Grid::anyHitInGroupsWide(uint32_t index, const TraceRay &r,
                                                              TraceState &s,
                                                              const Vec3 &frame) const {
    using namespace wide_ops;
    const PacketGroup *g = groups_.data() + index;
    uint32_t n;
    const WideFrame f = openGroupRun(g, n, frameStep_, frame, r);
    // Two groups at a time, the packets they let through two at a time.
    for (uint32_t i = 0; i < n; i += 2) {
        const PacketGroup *pair[2] = {g + i, i + 1 < n ? g + i + 1 : nullptr};
        __m256 tnear;
        int mask = groupPairMask(*pair[0], pair[1], f, s.limit, tnear);
        for (int m = mask; m; m &= m - 1) {
            int lane = __builtin_ctz(m);
            prefetchPacket(*store_, pair[lane >> 2]->packet[lane & 3]);
        }
        while (mask) {
            int lane = __builtin_ctz(mask);
            mask &= mask - 1;
            uint32_t k0 = pair[lane >> 2]->packet[lane & 3];
            if (!mask) {
                if (testPacket<true>(*store_, k0, r, s)) return true;
                break;
            }
            int second = __builtin_ctz(mask);
            mask &= mask - 1;
            if (packetPairHit(*store_, k0, pair[second >> 2]->packet[second & 3], r, s))
                return true;
        }
    }
    return false;
}

template <bool kAny>
bool Grid::testItems(const TraceRay &r, TraceState &s, const uint32_t *first, const uint32_t *last,
                     const Vec3 &frame) const {
    bool hit = false;
    for (const uint32_t *k = first; k != last; ++k) {
        uint32_t code = *k;
        uint32_t index = code & kItemIndexMask;
        switch (code >> kItemIndexBits) {
            case kItemPacket: {
                if (testPacket<kAny>(*store_, index, r, s)) {
                    if constexpr (kAny) return true;
                    hit = true;
                }
                break;
            }
            case kItemGroup: {
                // Two groups at a time where the processor can.
                if (r.wide ? (kAny ? anyHitInGroupsWide(index, r, s, frame)
                                   : closestInGroupsWide(index, r, s, frame))
                           : testGroups<kAny>(index, r, s, frame)) {
                    if constexpr (kAny) return true;
                    hit = true;
                }
                break;
            }
            case kItemTriangle: {
                float t, u, v;
                if (!intersectTriangle(store_->triangles[index], r, s.limit, t, u, v)) break;
                if constexpr (kAny) return true;
                s.limit = t, s.u = u, s.v = v;
                s.kind = kItemTriangle;
                s.prim = index;
                s.found = hit = true;
                break;
            }
            case kItemMotion: {
                const MotionTriangle &mt = store_->motion[index];
                Vec3 p[3];
                MotionHitInterpolator::cornersAt(&store_->motionCorners[mt.firstCorner], mt.steps,
                                                 r.time, p);
                float t, u, v;
                uint32_t flags = r.overrideFlags ? r.instFlags : mt.flags;
                if (!intersectTriangle(p[0], p[1] - p[0], p[2] - p[0], flags, r, s.limit, t, u, v))
                    break;
                if constexpr (kAny) return true;
                s.limit = t, s.u = u, s.v = v;
                s.kind = kItemMotion;
                s.prim = index;
                s.found = hit = true;
                break;
            }
            case kItemInstance: {
                const IntersectInstanceGrid &inst = store_->instances[index];
                if (!flagsVisible(inst.flags, r.required)) break;
                TraceRay local;
                if (!instanceRay(inst, r, local)) break;
                TraceState ls;
                ls.limit = s.limit;
                if (!inst.grid->traverse<kAny>(local, ls)) break;
                if constexpr (kAny) return true;
                // The whole hit comes from the shape grid: the triangle's identifier too, which
                // a packet of the shape grid carries and an earlier candidate must not leave.
                s.limit = ls.limit, s.u = ls.u, s.v = ls.v;
                s.kind = kItemInstance;
                s.prim = ls.prim;
                s.inst = index;
                s.id = inst.store->triangles[ls.prim].id;
                s.found = hit = true;
                break;
            }
            case kItemChild: {
                if (children_[index]->traverse<kAny>(r, s)) {
                    if constexpr (kAny) return true;
                    hit = true;
                }
                break;
            }
            default:
                break;
        }
    }
    return hit;
}

namespace {

// One axis of the walk: the step, the index of the next cell plane and the distance to it
// (recomputed exactly from the plane index after each step), and the distance between planes.
// The cell index along the axis is next - ahead; the walk leaves the grid when next reaches
// beyond. An axis the ray does not move along has its next plane at infinity and never leaves.
// The walk keeps three of these as named locals and reaches them only through the inlined
// helpers below, never by a run-time index, so that they stay in registers.
// What an axis reads of the grid and the ray (the grid's lower bound, cell size and its
// reciprocal, the ray's reciprocal direction and the cell count) is not kept in it: the walk
// passes it in from the grid and the ray at each use, so that setting up an axis copies nothing.
struct WalkAxis {
    int64_t next, ahead, step, beyond, cellStep;
    float tNext, base, delta;
};

struct AxisFixed {
    float lo, size, invSize, inv;
    int64_t n;
};

// Clips [t0, t1] to the slab of an axis; false when the ray misses it. A zero direction component
// tests the slab only.
__attribute__((always_inline)) inline bool clipAxis(float o, float d, float inv, float lo, float hi,
                                                    float &t0, float &t1) {
    if (d == 0.0f) return !(o < lo || o > hi);
    float ta = (lo - o) * inv;
    float tb = (hi - o) * inv;
    if (ta > tb) std::swap(ta, tb);
    t0 = std::max(t0, ta);
    t1 = std::min(t1, tb);
    return true;
}

__attribute__((always_inline)) inline float planeDistance(const WalkAxis &A, const AxisFixed &F) {
    return (A.base + float(A.next) * F.size) * F.inv;
}

// The three axes of a walk as the set-up computes them, x, y and z in lanes 0 to 2.
struct WalkStart {
    alignas(16) int32_t cell[4], step[4], beyond[4], cellStep[4];
    alignas(16) float tNext[4], base[4], delta[4];
};

// An axis from lane i of the set-up.
__attribute__((always_inline)) inline void startAxis(WalkAxis &A, const WalkStart &w, int i) {
    A.step = w.step[i];
    A.ahead = A.step > 0;
    A.next = int64_t(w.cell[i]) + A.ahead;
    A.beyond = w.beyond[i];
    A.cellStep = w.cellStep[i];
    A.tNext = w.tNext[i];
    A.base = w.base[i];
    A.delta = w.delta[i];
}

// Crosses the axis's next cell plane.
__attribute__((always_inline)) inline void advanceAxis(WalkAxis &A, const AxisFixed &F) {
    A.next += A.step;
    A.tNext = planeDistance(A, F);
}

// The axis whose far face of an empty cube the walk leaves through moves dist cells on; false
// when that leaves the grid.
__attribute__((always_inline)) inline bool leadAxis(WalkAxis &A, const AxisFixed &F, int64_t dist) {
    A.next += A.step * dist;
    if (uint64_t(A.next - A.ahead) >= uint64_t(F.n)) return false;
    A.tNext = planeDistance(A, F);
    return true;
}

// Any other axis moves to the cell the ray is in at the exit distance (at most dist - 1 cells
// on), with the plane ahead not before the exit; false when that leaves the grid.
__attribute__((always_inline)) inline bool followAxis(WalkAxis &A, const AxisFixed &F, float o,
                                                      float d, float tExit, int64_t dist) {
    if (A.step == 0 || A.tNext >= tExit) return true;
    int64_t from = A.next - A.ahead;
    int64_t last = from + A.step * (dist - 1);
    float f = (o + d * tExit - F.lo) * F.invSize;
    f = f >= 0.0f ? (f < float(F.n) ? f : float(F.n)) : 0.0f;
    int64_t at = int64_t(f);
    at = A.step > 0 ? std::clamp(at, from, last) : std::clamp(at, last, from);
    A.next = at + A.ahead;
    A.tNext = planeDistance(A, F);
    while (A.tNext < tExit && A.next - A.ahead != last) advanceAxis(A, F);
    return uint64_t(A.next - A.ahead) < uint64_t(F.n);
}

}  // namespace

template <bool kAny>
bool Grid::traverse(const TraceRay &r, TraceState &s) const {
    if (cells_.empty()) return false;
    // Clip the ray against the box (slab test).
    float t0 = 0.0f, t1 = s.limit;
    if (!clipAxis(r.o.x, r.d.x, r.inv.x, box_.min.x, box_.max.x, t0, t1) ||
        !clipAxis(r.o.y, r.d.y, r.inv.y, box_.min.y, box_.max.y, t0, t1) ||
        !clipAxis(r.o.z, r.d.z, r.inv.z, box_.min.z, box_.max.z, t0, t1) || !(t0 <= t1))
        return false;

    WalkAxis X, Y, Z;
    const auto fx = [&] {
        return AxisFixed{box_.min.x, cellSize_.x, invCellSize_.x, r.inv.x, nx_};
    };
    const auto fy = [&] {
        return AxisFixed{box_.min.y, cellSize_.y, invCellSize_.y, r.inv.y, ny_};
    };
    const auto fz = [&] {
        return AxisFixed{box_.min.z, cellSize_.z, invCellSize_.z, r.inv.z, nz_};
    };
    const int64_t strideY = nx_, strideZ = nx_ * ny_;
    // The three axes are set up side by side, with the operations the walk's steps use, lane
    // for lane: the cell the ray enters at t0, the step towards the next plane and its
    // distance (the largest float on an axis the ray does not move along).
    WalkStart w;
    uint32_t down;
    {
        const __m128 o = _mm_setr_ps(r.o.x, r.o.y, r.o.z, 0.0f);
        const __m128 d = _mm_setr_ps(r.d.x, r.d.y, r.d.z, 0.0f);
        const __m128 inv = _mm_setr_ps(r.inv.x, r.inv.y, r.inv.z, 0.0f);
        const __m128 zero = _mm_setzero_ps();
        // A zero direction component adds zero to the origin: t0 is finite.
        const __m128 p = _mm_add_ps(o, _mm_mul_ps(d, _mm_set1_ps(t0)));
        // The cell index: NaN and negative values clamp to 0 (max returns its second operand
        // on NaN) before the conversion, large ones to the last cell before and after it
        // (above 2^24 cells the last index may round up in float).
        __m128 f = _mm_mul_ps(_mm_sub_ps(p, walk_.lo), walk_.invSize);
        f = _mm_min_ps(_mm_max_ps(f, zero), walk_.top);
        __m128i cell3 = _mm_cvttps_epi32(f);
        const __m128i over = _mm_cmpgt_epi32(cell3, walk_.last);
        cell3 = _mm_or_si128(_mm_and_si128(over, walk_.last), _mm_andnot_si128(over, cell3));
        const __m128i up = _mm_castps_si128(_mm_cmpgt_ps(d, zero));
        const __m128i back = _mm_castps_si128(_mm_cmplt_ps(d, zero));
        const __m128 still = _mm_cmpeq_ps(d, zero);
        const __m128i step = _mm_sub_epi32(back, up);
        const __m128i next = _mm_sub_epi32(cell3, up);
        // Beyond: the cell count + 1 going up, -1 going down, -2 standing still.
        const __m128i beyond =
            _mm_or_si128(_mm_and_si128(up, _mm_add_epi32(walk_.last, _mm_set1_epi32(2))),
                         _mm_andnot_si128(up, _mm_or_si128(back, _mm_set1_epi32(-2))));
        const __m128i cellStep =
            _mm_sub_epi32(_mm_and_si128(up, walk_.stride), _mm_and_si128(back, walk_.stride));
        const __m128 base = _mm_sub_ps(walk_.lo, o);
        const __m128 largest = _mm_set1_ps(kInfiniteDistance);
        const __m128 tNext =
            _mm_mul_ps(_mm_add_ps(base, _mm_mul_ps(_mm_cvtepi32_ps(next), walk_.size)), inv);
        const __m128 absInv = _mm_andnot_ps(_mm_set1_ps(-0.0f), inv);
        const __m128 delta = _mm_mul_ps(walk_.size, absInv);
        _mm_store_si128(reinterpret_cast<__m128i *>(w.cell), cell3);
        _mm_store_si128(reinterpret_cast<__m128i *>(w.step), step);
        _mm_store_si128(reinterpret_cast<__m128i *>(w.beyond), beyond);
        _mm_store_si128(reinterpret_cast<__m128i *>(w.cellStep), cellStep);
        _mm_store_ps(w.tNext, _mm_or_ps(_mm_andnot_ps(still, tNext), _mm_and_ps(still, largest)));
        _mm_store_ps(w.base, base);
        _mm_store_ps(w.delta, _mm_or_ps(_mm_andnot_ps(still, delta), _mm_and_ps(still, largest)));
        down = uint32_t(_mm_movemask_ps(_mm_castsi128_ps(back))) & 7u;
    }
    startAxis(X, w, 0);
    startAxis(Y, w, 1);
    startAxis(Z, w, 2);
    int64_t cell = int64_t(w.cell[0]) + strideY * w.cell[1] + strideZ * w.cell[2];
    // Where empty cells keep the distance code of the ray's direction octant.
    const uint32_t shift = 3 * down;
    const uint32_t *cells = cells_.data();
    const uint32_t *items = items_.data();
    // The walk waits on each cell's word before it knows where to go next. In grids whose
    // words do not stay in a core's cache, start fetching the cells at a few points ahead along
    // the ray now, so that those waits overlap.
    if (nx_ * ny_ * nz_ >= kFetchAheadMinCells) {
        __builtin_prefetch(cells + cell);
        // The points, held at the walk's end, in cell units clamped to the grid, and their
        // cells' indices, all four side by side. The indices are computed in float: above 2^24
        // cells one may round to a neighbouring cell, which only costs a useless fetch.
        const float h = kFetchAheadSpacing * std::min({X.delta, Y.delta, Z.delta});
        const float4 t = _mm_min_ps(
            float4(t0) + float4(_mm_setr_ps(1.0f, 2.0f, 3.0f, 4.0f)) * float4(h), float4(t1));
        const auto axisCell = [&](const float4 &o, const float4 &d, int a) {
            const float4 f = (o + d * t - fetch_.lo[a]) * fetch_.invSize[a];
            return float4(_mm_cvtepi32_ps(
                _mm_cvttps_epi32(_mm_min_ps(_mm_max_ps(f, float4::zero()), fetch_.top[a]))));
        };
        const float4 at =
            _mm_min_ps(axisCell(r.ox, r.dx, 0) + axisCell(r.oy, r.dy, 1) * fetch_.strideY +
                           axisCell(r.oz, r.dz, 2) * fetch_.strideZ,
                       fetch_.lastCell);
        alignas(16) int32_t index[4];
        _mm_store_si128(reinterpret_cast<__m128i *>(index), _mm_cvttps_epi32(at));
        static_assert(kFetchAhead == 4);
        for (int k = 0; k < kFetchAhead; ++k) __builtin_prefetch(cells + index[k]);
    }
    bool found = false;
    // Every iteration advances at least one cell along the ray, so a walk needs at most
    // nx + ny + nz of them.
    for (int64_t walked = nx_ + ny_ + nz_; walked > 0; --walked) {
        // The axis of the nearest cell plane; while this cell is looked at, fetch the cell the
        // walk is likely to enter next.
        const int a = X.tNext < Y.tNext ? (X.tNext < Z.tNext ? 0 : 2) : (Y.tNext < Z.tNext ? 1 : 2);
        const float tA = a == 0 ? X.tNext : (a == 1 ? Y.tNext : Z.tNext);
        const int64_t stepA = a == 0 ? X.cellStep : (a == 1 ? Y.cellStep : Z.cellStep);
        const bool inside =
            a == 0 ? X.next + X.step != X.beyond
                   : (a == 1 ? Y.next + Y.step != Y.beyond : Z.next + Z.step != Z.beyond);
        if (inside) __builtin_prefetch(cells + cell + stepA);
        const uint32_t word = cells[cell];
        const uint32_t dist = (word >> kItemIndexBits) == kItemEmpty
                                  ? uint32_t(kWalkDistance[word >> shift & 7])
                                  : 0u;
        if (dist == 0) {
            const Vec3 frame = frameOrigin(X.next - X.ahead, Y.next - Y.ahead, Z.next - Z.ahead);
            bool hitHere;
            if ((word >> kItemIndexBits) == kItemGroup && r.wide) {
                // Most occupied cells name their groups: no item dispatch.
                hitHere = kAny ? anyHitInGroupsWide(word & kItemIndexMask, r, s, frame)
                               : closestInGroupsWide(word & kItemIndexMask, r, s, frame);
            } else {
                const uint32_t *first = cells + cell, *last = first + 1;
                if ((word >> kItemIndexBits) == kItemList) {
                    const uint32_t *list = items + (word & kItemIndexMask);
                    first = list + 1;
                    last = first + *list;
                }
                // Several items: start fetching the boxes and packets of all of them at once.
                if (last - first > 1)
                    for (const uint32_t *k = first; k != last; ++k) {
                        // (A list holds no list codes.)
                        if (const char *p = itemData(*k)) {
                            __builtin_prefetch(p);
                            __builtin_prefetch(p + 64);
                        }
                    }
                hitHere = testItems<kAny>(r, s, first, last, frame);
            }
            if (hitHere) {
                if constexpr (kAny) return true;
                found = true;
            }
            // The next cell's word has arrived meanwhile: start fetching what it names.
            if (inside && tA < s.limit) {
                if (const char *p = itemData(cells[cell + stepA])) __builtin_prefetch(p);
            }
        } else if (dist >= 2) {
            // Nothing lies ahead of this cell the way the ray goes: the walk is over.
            if (dist == 255) break;
            // Every cell within dist - 1 of this one is empty: leave that cube in one jump
            // through its nearest far face. The other axes move to the cell the ray is in
            // there (at most dist - 1 cells on), with the plane ahead not before the exit.
            const float reach = float(dist - 1);
            const float e0 = X.tNext + reach * X.delta, e1 = Y.tNext + reach * Y.delta,
                        e2 = Z.tNext + reach * Z.delta;
            const int j = e0 < e1 ? (e0 < e2 ? 0 : 2) : (e1 < e2 ? 1 : 2);
            const float tExit = j == 0 ? e0 : (j == 1 ? e1 : e2);
            if (!(tExit < s.limit)) break;
            const int64_t d = int64_t(dist);
            if (j == 0) {
                if (!leadAxis(X, fx(), d)) break;
                if (!followAxis(Y, fy(), r.o.y, r.d.y, tExit, d) ||
                    !followAxis(Z, fz(), r.o.z, r.d.z, tExit, d))
                    return found;
            } else if (j == 1) {
                if (!leadAxis(Y, fy(), d)) break;
                if (!followAxis(X, fx(), r.o.x, r.d.x, tExit, d) ||
                    !followAxis(Z, fz(), r.o.z, r.d.z, tExit, d))
                    return found;
            } else {
                if (!leadAxis(Z, fz(), d)) break;
                if (!followAxis(X, fx(), r.o.x, r.d.x, tExit, d) ||
                    !followAxis(Y, fy(), r.o.y, r.d.y, tExit, d))
                    return found;
            }
            cell = (Z.next - Z.ahead) * strideZ + (Y.next - Y.ahead) * strideY + X.next - X.ahead;
            continue;
        }
        // Step to the neighbour across the nearest cell plane. The best hit lies inside the
        // cells walked so far when that plane is beyond it: nothing further can be closer.
        if (tA >= s.limit || !inside) break;
        cell += stepA;
        if (a == 0)
            advanceAxis(X, fx());
        else if (a == 1)
            advanceAxis(Y, fy());
        else
            advanceAxis(Z, fz());
    }
    return found;
}

template bool Grid::traverse<false>(const TraceRay &, TraceState &) const;
template bool Grid::traverse<true>(const TraceRay &, TraceState &) const;

}  // namespace ox
