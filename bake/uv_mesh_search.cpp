#include "bake/uv_mesh_search.h"

#include <algorithm>
#include <cmath>

#include "core/message.h"
#include "raytrace/instance.h"

namespace ox {
namespace {

// Barycentric tolerance of the containment test: a point on a shared edge belongs to both
// triangles, so that no texel centre falls through the crack between them.
constexpr float kEdgeEps = 1e-6f;
// Strict interior for overlap counting: a point on a shared edge is no overlap.
constexpr float kInteriorEps = 1e-4f;

/// Squared distance from p to segment [a, b] and the parameter of the nearest point.
float segmentDistance2(Vec2 p, Vec2 a, Vec2 b, float &t) {
    const Vec2 ab = b - a, ap = p - a;
    const float l2 = ab.x * ab.x + ab.y * ab.y;
    t = l2 > 0.0f ? std::clamp((ap.x * ab.x + ap.y * ab.y) / l2, 0.0f, 1.0f) : 0.0f;
    const float dx = ap.x - ab.x * t, dy = ap.y - ab.y * t;
    return dx * dx + dy * dy;
}

/// True when the triangle a, b, c meets the axis-aligned square [x0, x1] x [y0, y1]
/// (separating axes: the two box axes and the three edge normals).
bool triangleMeetsBox(Vec2 a, Vec2 b, Vec2 c, float x0, float y0, float x1, float y1) {
    if (std::max({a.x, b.x, c.x}) < x0 || std::min({a.x, b.x, c.x}) > x1) return false;
    if (std::max({a.y, b.y, c.y}) < y0 || std::min({a.y, b.y, c.y}) > y1) return false;
    const Vec2 p[3] = {a, b, c};
    for (int e = 0; e < 3; ++e) {
        const Vec2 s = p[e], d = p[(e + 1) % 3] - p[e];
        const Vec2 n{-d.y, d.x};
        const float tri0 = n.x * (p[(e + 2) % 3].x - s.x) + n.y * (p[(e + 2) % 3].y - s.y);
        float boxMin = 3.4e38f, boxMax = -3.4e38f;
        const float cx[2] = {x0, x1}, cy[2] = {y0, y1};
        for (float bx : cx)
            for (float by : cy) {
                const float v = n.x * (bx - s.x) + n.y * (by - s.y);
                boxMin = std::min(boxMin, v), boxMax = std::max(boxMax, v);
            }
        // The triangle projects to [min(0, tri0), max(0, tri0)] on this axis.
        if (boxMax < std::min(0.0f, tri0) || boxMin > std::max(0.0f, tri0)) return false;
    }
    return true;
}

}  // namespace

bool UvMeshSearch::build(const std::vector<ResolvedBakeShape> &shapes, const UvRect &rect,
                         int32_t width, int32_t height, int32_t windingOrder) {
    tris_.clear();
    cellStart_.clear();
    cellTris_.clear();
    width_ = width, height_ = height;
    const float sx = float(width) / (rect.uMax - rect.uMin);
    const float sy = float(height) / (rect.vMax - rect.vMin);
    const bool wantCcw = windingOrder == int32_t(WindingOrder::CounterClockwise);

    size_t total = 0;
    for (const ResolvedBakeShape &s : shapes) total += s.instance->shape().triangleCount();
    tris_.reserve(total);
    for (size_t si = 0; si < shapes.size(); ++si) {
        const ResolvedBakeShape &s = shapes[si];
        const Shape &shape = s.instance->shape();
        const VertexSet<Vec2> uv = shape.vertices().uvSet(s.uvSet);
        auto texel = [&](uint32_t v) {
            return Vec2{((uv[v].x * s.uvScale.x + s.uvBias.x) - rect.uMin) * sx,
                        ((uv[v].y * s.uvScale.y + s.uvBias.y) - rect.vMin) * sy};
        };
        for (uint32_t t = 0; t < shape.triangleCount(); ++t) {
            const Triangle &tri = shape.triangles()[t];
            Tri r;
            r.p0 = texel(tri.v[0]);
            r.e1 = texel(tri.v[1]) - r.p0;
            r.e2 = texel(tri.v[2]) - r.p0;
            const float area = r.e1.x * r.e2.y - r.e1.y * r.e2.x;
            // Degenerate or non-finite UV triangles cover nothing.
            if (!(std::fabs(area) > 1e-12f) || !std::isfinite(area)) continue;
            r.invArea = 1.0f / area;
            r.shape = int32_t(si);
            r.triangle = t;
            r.preferred = (area > 0.0f) == wantCcw;
            tris_.push_back(r);
        }
    }

    // About two triangles per cell, cells at least one texel and at most 64 texels wide.
    const double area = double(width) * double(height);
    double cell = std::sqrt(area / std::max<double>(1.0, double(tris_.size()) * 0.5));
    cell = std::clamp(cell, 1.0, 64.0);
    cellSize_ = float(cell);
    invCellSize_ = 1.0f / cellSize_;
    cellsX_ = std::max(1, int32_t(std::ceil(width / cell)));
    cellsY_ = std::max(1, int32_t(std::ceil(height / cell)));

    // Two passes: count per cell, then fill (compressed rows). A triangle is listed in every
    // cell its box meets, widened by two texels so that near searches find it too.
    const float margin = 2.0f;
    std::vector<uint32_t> counts(cellCount() + 1, 0);
    auto forCells = [&](const Tri &t, auto &&f) {
        const Vec2 a = t.p0, b = t.p0 + t.e1, c = t.p0 + t.e2;
        int32_t cx0, cy0, cx1, cy1;
        cellRange(std::min({a.x, b.x, c.x}) - margin, std::min({a.y, b.y, c.y}) - margin,
                  std::max({a.x, b.x, c.x}) + margin, std::max({a.y, b.y, c.y}) + margin, cx0, cy0,
                  cx1, cy1);
        for (int32_t cy = cy0; cy <= cy1; ++cy)
            for (int32_t cx = cx0; cx <= cx1; ++cx) f(size_t(cy) * size_t(cellsX_) + size_t(cx));
    };
    uint64_t entries = 0;
    for (const Tri &t : tris_) forCells(t, [&](size_t c) { ++counts[c], ++entries; });
    if (entries > uint64_t(UINT32_MAX)) {
        message(kMsgError, 6, "Mesh search: %llu cell entries are too many for one target.",
                static_cast<unsigned long long>(entries));
        return false;
    }
    cellStart_.assign(cellCount() + 1, 0);
    for (size_t c = 0; c < cellCount(); ++c) cellStart_[c + 1] = cellStart_[c] + counts[c];
    cellTris_.resize(entries);
    std::vector<uint32_t> fill(cellStart_.begin(), cellStart_.end() - 1);
    for (uint32_t i = 0; i < tris_.size(); ++i)
        forCells(tris_[i], [&](size_t c) { cellTris_[fill[c]++] = i; });
    message(kMsgVerbose, 6, "--- Mesh search details ---");
    message(kMsgVerbose, 6, "Triangles: %zu, cells: %d x %d of %.2f texels, entries: %llu",
            tris_.size(), cellsX_, cellsY_, double(cellSize_),
            static_cast<unsigned long long>(entries));
    return true;
}

void UvMeshSearch::cellRange(float x0, float y0, float x1, float y1, int32_t &cx0, int32_t &cy0,
                             int32_t &cx1, int32_t &cy1) const {
    auto cellOf = [&](float v, int32_t n) {
        const float c = std::floor(v * invCellSize_);
        if (!(c >= 0.0f)) return 0;  // also NaN
        return c >= float(n - 1) ? n - 1 : int32_t(c);
    };
    cx0 = cellOf(x0, cellsX_), cx1 = cellOf(x1, cellsX_);
    cy0 = cellOf(y0, cellsY_), cy1 = cellOf(y1, cellsY_);
}

UvHit UvMeshSearch::find(float x, float y) const {
    UvHit hit;
    if (tris_.empty() || !(x >= 0.0f && y >= 0.0f && x <= float(width_) && y <= float(height_)))
        return hit;
    int32_t cx, cy, cx1, cy1;
    cellRange(x, y, x, y, cx, cy, cx1, cy1);
    const size_t c = size_t(cy) * size_t(cellsX_) + size_t(cx);
    for (uint32_t k = cellStart_[c]; k < cellStart_[c + 1]; ++k) {
        const Tri &t = tris_[cellTris_[k]];
        float b1, b2;
        barycentrics(t, x, y, b1, b2);
        if (b1 >= -kEdgeEps && b2 >= -kEdgeEps && b1 + b2 <= 1.0f + kEdgeEps) {
            if (!hit.found() || t.preferred) {
                hit = {t.shape, t.triangle, b1, b2, cellTris_[k]};
                if (t.preferred) return hit;
            }
        }
    }
    return hit;
}

int UvMeshSearch::countContaining(float x, float y) const {
    if (tris_.empty() || !(x >= 0.0f && y >= 0.0f && x <= float(width_) && y <= float(height_)))
        return 0;
    int32_t cx, cy, cx1, cy1;
    cellRange(x, y, x, y, cx, cy, cx1, cy1);
    const size_t c = size_t(cy) * size_t(cellsX_) + size_t(cx);
    int n = 0;
    for (uint32_t k = cellStart_[c]; k < cellStart_[c + 1]; ++k) {
        float b1, b2;
        barycentrics(tris_[cellTris_[k]], x, y, b1, b2);
        if (b1 > kInteriorEps && b2 > kInteriorEps && b1 + b2 < 1.0f - kInteriorEps) ++n;
    }
    return n;
}

UvHit UvMeshSearch::findNear(float x, float y, float reach, bool clampToTriangle) const {
    UvHit best;
    if (tris_.empty() || !std::isfinite(x) || !std::isfinite(y)) return best;
    int32_t cx0, cy0, cx1, cy1;
    cellRange(x - reach, y - reach, x + reach, y + reach, cx0, cy0, cx1, cy1);
    float bestD2 = 3.4e38f;
    bool bestPreferred = false;
    uint32_t bestIndex = UINT32_MAX;
    const Vec2 p{x, y};
    for (int32_t cy = cy0; cy <= cy1; ++cy)
        for (int32_t cx = cx0; cx <= cx1; ++cx) {
            const size_t c = size_t(cy) * size_t(cellsX_) + size_t(cx);
            for (uint32_t k = cellStart_[c]; k < cellStart_[c + 1]; ++k) {
                const uint32_t index = cellTris_[k];
                const Tri &t = tris_[index];
                const Vec2 a = t.p0, b = t.p0 + t.e1, cc = t.p0 + t.e2;
                if (!triangleMeetsBox(a, b, cc, x - reach, y - reach, x + reach, y + reach))
                    continue;
                float b1, b2;
                barycentrics(t, x, y, b1, b2);
                float d2 = 0.0f;
                float n1 = b1, n2 = b2;  // barycentrics of the nearest point
                if (!(b1 >= 0.0f && b2 >= 0.0f && b1 + b2 <= 1.0f)) {
                    float ta, tb, tc;
                    const float da = segmentDistance2(p, a, b, ta);   // b1 = ta, b2 = 0
                    const float db = segmentDistance2(p, b, cc, tb);  // b1 = 1 - tb, b2 = tb
                    const float dc = segmentDistance2(p, cc, a, tc);  // b1 = 0, b2 = 1 - tc
                    d2 = da, n1 = ta, n2 = 0.0f;
                    if (db < d2) d2 = db, n1 = 1.0f - tb, n2 = tb;
                    if (dc < d2) d2 = dc, n1 = 0.0f, n2 = 1.0f - tc;
                }
                // Preferred winding first, then the nearest, then the first in triangle order
                // (cells repeat triangles; the index keeps the choice independent of the cell).
                const bool better = bestIndex == UINT32_MAX || (t.preferred && !bestPreferred) ||
                                    (t.preferred == bestPreferred &&
                                     (d2 < bestD2 || (d2 == bestD2 && index < bestIndex)));
                if (!better) continue;
                bestIndex = index, bestD2 = d2, bestPreferred = t.preferred;
                best = {t.shape, t.triangle, clampToTriangle ? n1 : b1, clampToTriangle ? n2 : b2,
                        index};
            }
        }
    return best;
}

UvCoverage UvMeshSearch::coverage() const {
    UvCoverage c;
    for (int32_t y = 0; y < height_; ++y)
        for (int32_t x = 0; x < width_; ++x) {
            const float px = float(x) + 0.5f, py = float(y) + 0.5f;
            if (!find(px, py).found()) continue;
            ++c.covered;
            if (countContaining(px, py) > 1) ++c.overlapping;
        }
    return c;
}

}  // namespace ox
