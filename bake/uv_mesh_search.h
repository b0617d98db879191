#pragma once

#include <cstdint>
#include <vector>

#include "bake/bake_target.h"
#include "core/types.h"

/// The mesh search of a texture bake: finds the triangle of a target's shapes under a point of
/// the target, in texel units (texel (x, y) spans [x, x + 1] x [y, y + 1], row 0 at v = vMin).
namespace ox {

/// A triangle found under a point: its shape (index into the target's shapes), its triangle in
/// that shape, and the barycentrics b1, b2 of corners 1 and 2 (corner 0 has 1 - b1 - b2).
struct UvHit {
    int32_t shape = -1;
    uint32_t triangle = 0;
    float b1 = 0.0f, b2 = 0.0f;
    uint32_t index = 0;  ///< the triangle's place in the search (for corners)
    bool found() const { return shape >= 0; }
};

/// What a search over all texel centres of a target found: covered texels and those under two
/// or more overlapping triangles.
struct UvCoverage {
    int64_t covered = 0;
    int64_t overlapping = 0;
};

/// A uniform grid over the target holding, per cell, the triangles whose UV box meets it, in
/// shape order then triangle order. Built once per target; read-only and shared by threads.
class UvMeshSearch {
public:
    /// Builds the search over shapes for a target of width x height texels whose whole area is
    /// rect; windingOrder (a WindingOrder value) names the preferred triangles.
    bool build(const std::vector<ResolvedBakeShape> &shapes, const UvRect &rect, int32_t width,
               int32_t height, int32_t windingOrder);

    /// The triangle containing the point (x, y): among those that contain it, the first of the
    /// preferred winding, else the first. Not found when none contains it.
    UvHit find(float x, float y) const;
    /// The triangle nearest to (x, y) among those that meet the square of half-edge reach
    /// around it (preferred winding first). With clampToTriangle the barycentrics are those of
    /// the triangle's point nearest to (x, y); otherwise those of (x, y) itself, which lie
    /// outside the triangle when the point does (the surface extrapolated).
    UvHit findNear(float x, float y, float reach, bool clampToTriangle) const;
    /// Number of triangles containing (x, y) strictly inside (shared edges do not count).
    int countContaining(float x, float y) const;

    /// Searches every texel centre once: how many are covered and how many overlap.
    UvCoverage coverage() const;

    /// The texel-space corners of a triangle found by a search.
    void corners(const UvHit &hit, Vec2 out[3]) const {
        const Tri &t = tris_[hit.index];
        out[0] = t.p0, out[1] = t.p0 + t.e1, out[2] = t.p0 + t.e2;
    }
    /// Number of triangles in the search and of grid cells.
    size_t triangleCount() const { return tris_.size(); }
    size_t cellCount() const { return size_t(cellsX_) * size_t(cellsY_); }
    int32_t width() const { return width_; }
    int32_t height() const { return height_; }

private:
    struct Tri {
        Vec2 p0, e1, e2;       // corner 0 and the edges to corners 1 and 2, texel units
        float invArea = 0.0f;  // 1 / (e1 x e2)
        int32_t shape = 0;
        uint32_t triangle = 0;
        bool preferred = false;
    };
    /// Barycentrics of (x, y) in t.
    static void barycentrics(const Tri &t, float x, float y, float &b1, float &b2) {
        const float dx = x - t.p0.x, dy = y - t.p0.y;
        b1 = (dx * t.e2.y - dy * t.e2.x) * t.invArea;
        b2 = (t.e1.x * dy - t.e1.y * dx) * t.invArea;
    }
    void cellRange(float x0, float y0, float x1, float y1, int32_t &cx0, int32_t &cy0, int32_t &cx1,
                   int32_t &cy1) const;

    std::vector<Tri> tris_;
    std::vector<uint32_t> cellStart_;  // cellCount() + 1 offsets into cellTris_
    std::vector<uint32_t> cellTris_;
    int32_t width_ = 0, height_ = 0;
    int32_t cellsX_ = 0, cellsY_ = 0;
    float cellSize_ = 1.0f, invCellSize_ = 1.0f;
};

}  // namespace ox
