#include "tools/lightmap_uv.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstring>
#include <limits>
#include <numbers>
#include <queue>
#include <unordered_map>

#include "core/message.h"

namespace ox {

namespace {

struct PositionHash {
    size_t operator()(const Vec3 &p) const {
        uint32_t b[3];
        std::memcpy(b, &p.x, 12);
        return (size_t(b[0]) * 73856093u) ^ (size_t(b[1]) * 19349663u) ^ (size_t(b[2]) * 83492791u);
    }
};

// Vertices at one position share an id, so charts grow across seams of other attributes.
std::vector<uint32_t> positionIds(const std::vector<Vec3> &positions) {
    std::unordered_map<Vec3, uint32_t, PositionHash> ids;
    ids.reserve(positions.size());
    std::vector<uint32_t> out(positions.size());
    for (size_t i = 0; i < positions.size(); ++i) {
        Vec3 p = positions[i];
        // -0 and +0 are one position.
        p.x += 0.0f, p.y += 0.0f, p.z += 0.0f;
        out[i] = ids.emplace(p, uint32_t(ids.size())).first->second;
    }
    return out;
}

Vec3 unitNormal(const Vec3 &p0, const Vec3 &p1, const Vec3 &p2, float &area) {
    Vec3 n = cross(p1 - p0, p2 - p0);
    float len = n.length();
    area = 0.5f * len;
    return len > 0.0f && std::isfinite(len) ? n / len : Vec3();
}

Vec3 perpendicular(const Vec3 &n) {
    Vec3 t = std::fabs(n.x) > std::fabs(n.y) ? Vec3(n.z, 0.0f, -n.x) : Vec3(0.0f, n.z, -n.y);
    if (t.lengthSquared() == 0.0f) t = Vec3(1.0f, 0.0f, 0.0f);
    return t.normalize();
}

double cross2(const Vec2 &o, const Vec2 &a, const Vec2 &b) {
    return double(a.x - o.x) * double(b.y - o.y) - double(a.y - o.y) * double(b.x - o.x);
}

// True when the interiors of two triangles overlap by more than eps (touching edges and
// corners do not count): no edge normal of either separates them.
bool trianglesOverlap(const Vec2 a[3], const Vec2 b[3], double eps) {
    const Vec2 *tris[2] = {a, b};
    for (int t = 0; t < 2; ++t) {
        const Vec2 *tri = tris[t];
        for (int e = 0; e < 3; ++e) {
            Vec2 p = tri[e], q = tri[(e + 1) % 3];
            double nx = -(double(q.y) - p.y), ny = double(q.x) - p.x;
            double len = std::sqrt(nx * nx + ny * ny);
            if (len == 0.0) continue;
            nx /= len, ny /= len;
            double minA = 1e300, maxA = -1e300, minB = 1e300, maxB = -1e300;
            for (int k = 0; k < 3; ++k) {
                double da = a[k].x * nx + a[k].y * ny, db = b[k].x * nx + b[k].y * ny;
                minA = std::min(minA, da), maxA = std::max(maxA, da);
                minB = std::min(minB, db), maxB = std::max(maxB, db);
            }
            if (maxA <= minB + eps || maxB <= minA + eps) return false;
        }
    }
    return true;
}

// Projected triangles of the chart being grown, bucketed by a uniform grid.
class ChartGrid {
public:
    explicit ChartGrid(double cell) : cell_(cell > 0.0 ? cell : 1.0) {}
    void clear() { cells_.clear(), tris_.clear(); }

    bool overlaps(const Vec2 t[3], double eps) const {
        bool hit = false;
        forCells(t, [&](int64_t key) {
            auto it = cells_.find(key);
            if (it == cells_.end()) return;
            for (uint32_t k : it->second)
                if (!hit && trianglesOverlap(t, tris_[k].data(), eps)) hit = true;
        });
        return hit;
    }
    void insert(const Vec2 t[3]) {
        uint32_t k = uint32_t(tris_.size());
        tris_.push_back({t[0], t[1], t[2]});
        forCells(t, [&](int64_t key) { cells_[key].push_back(k); });
    }

private:
    template <typename F>
    void forCells(const Vec2 t[3], F &&fn) const {
        double x0 = std::min({t[0].x, t[1].x, t[2].x}), x1 = std::max({t[0].x, t[1].x, t[2].x});
        double y0 = std::min({t[0].y, t[1].y, t[2].y}), y1 = std::max({t[0].y, t[1].y, t[2].y});
        int64_t cx0 = int64_t(std::floor(x0 / cell_)), cx1 = int64_t(std::floor(x1 / cell_));
        int64_t cy0 = int64_t(std::floor(y0 / cell_)), cy1 = int64_t(std::floor(y1 / cell_));
        // A triangle far larger than the cells is looked up in a bounded window only; the
        // triangles it could meet are then found through their own cells.
        cx1 = std::min(cx1, cx0 + 255), cy1 = std::min(cy1, cy0 + 255);
        for (int64_t y = cy0; y <= cy1; ++y)
            for (int64_t x = cx0; x <= cx1; ++x) fn((y << 32) ^ (x & 0xffffffff));
    }
    double cell_;
    std::unordered_map<int64_t, std::vector<uint32_t>> cells_;
    std::vector<std::array<Vec2, 3>> tris_;
};

}  // namespace

float triangleStretch(const Vec3 &p0, const Vec3 &p1, const Vec3 &p2, const Vec2 &q0,
                      const Vec2 &q1, const Vec2 &q2) {
    double det = cross2(q0, q1, q2);
    if (det == 0.0) return std::numeric_limits<float>::infinity();
    // Partial derivatives of the surface point over the plane's two coordinates.
    Vec3 ss = (p0 * float(q1.y - q2.y) + p1 * float(q2.y - q0.y) + p2 * float(q0.y - q1.y)) *
              float(1.0 / det);
    Vec3 st = (p0 * float(q2.x - q1.x) + p1 * float(q0.x - q2.x) + p2 * float(q1.x - q0.x)) *
              float(1.0 / det);
    double a = dot(ss, ss), b = dot(ss, st), c = dot(st, st);
    double root = std::sqrt((a - c) * (a - c) + 4.0 * b * b);
    double smax = std::sqrt(std::max(0.0, 0.5 * (a + c + root)));
    double smin = std::sqrt(std::max(0.0, 0.5 * (a + c - root)));
    if (smin <= 0.0) return std::numeric_limits<float>::infinity();
    return float(smax / smin);
}

uint32_t buildCharts(const std::vector<Vec3> &positions, const std::vector<uint32_t> &triangles,
                     float maxAngleDegrees, std::vector<uint32_t> &chartOf,
                     std::vector<Vec3> &chartAxis) {
    const size_t triCount = triangles.size() / 3;
    const uint32_t kNone = std::numeric_limits<uint32_t>::max();
    chartOf.assign(triCount, kNone);
    chartAxis.clear();
    if (triCount == 0) return 0;
    const std::vector<uint32_t> ids = positionIds(positions);

    std::vector<Vec3> normal(triCount);
    std::vector<float> area(triCount);
    double edgeSum = 0.0;
    for (size_t t = 0; t < triCount; ++t) {
        const Vec3 &p0 = positions[triangles[3 * t]], &p1 = positions[triangles[3 * t + 1]],
                   &p2 = positions[triangles[3 * t + 2]];
        normal[t] = unitNormal(p0, p1, p2, area[t]);
        edgeSum += (p1 - p0).length() + (p2 - p1).length() + (p0 - p2).length();
    }
    const double cell = std::max(edgeSum / (3.0 * double(triCount)), 1e-12);

    // Triangles by edge: each undirected edge (by position) lists the triangles that use it.
    std::unordered_map<uint64_t, std::vector<uint32_t>> edgeTris;
    edgeTris.reserve(triCount * 2);
    auto edgeKey = [&](size_t t, int e) {
        uint32_t a = ids[triangles[3 * t + e]], b = ids[triangles[3 * t + (e + 1) % 3]];
        if (a > b) std::swap(a, b);
        return (uint64_t(a) << 32) | b;
    };
    for (size_t t = 0; t < triCount; ++t)
        for (int e = 0; e < 3; ++e) edgeTris[edgeKey(t, e)].push_back(uint32_t(t));

    // Seeds in order of decreasing area, so large flat faces set the chart planes.
    std::vector<uint32_t> order(triCount);
    for (size_t t = 0; t < triCount; ++t) order[t] = uint32_t(t);
    std::stable_sort(order.begin(), order.end(),
                     [&](uint32_t a, uint32_t b) { return area[a] > area[b]; });

    const float cosLimit =
        std::cos(std::clamp(maxAngleDegrees, 0.0f, 89.0f) * std::numbers::pi_v<float> / 180.0f);
    uint32_t charts = 0;
    ChartGrid grid(cell);
    std::vector<uint32_t> queuedFor(triCount, kNone);
    for (uint32_t seed : order) {
        if (chartOf[seed] != kNone) continue;
        const uint32_t chart = charts++;
        Vec3 axis = normal[seed];
        if (axis.lengthSquared() == 0.0f) axis = Vec3(0.0f, 0.0f, 1.0f);
        chartAxis.push_back(axis);
        const Vec3 u = perpendicular(axis), v = cross(axis, u);
        auto project = [&](size_t t, Vec2 out[3]) {
            for (int k = 0; k < 3; ++k) {
                const Vec3 &p = positions[triangles[3 * t + k]];
                out[k] = Vec2(dot(p, u), dot(p, v));
            }
        };
        grid.clear();
        // Best-first growth: the candidate facing most like the chart goes first.
        using Item = std::pair<float, uint32_t>;
        std::priority_queue<Item> queue;
        queue.emplace(2.0f, seed);
        queuedFor[seed] = chart;
        double eps = 1e-6 * cell;
        while (!queue.empty()) {
            uint32_t t = queue.top().second;
            queue.pop();
            if (chartOf[t] != kNone) continue;
            Vec2 proj[3];
            project(t, proj);
            // A triangle that would fold over the chart is left for a later chart.
            if (t != seed && grid.overlaps(proj, eps)) continue;
            chartOf[t] = chart;
            grid.insert(proj);
            for (int e = 0; e < 3; ++e)
                for (uint32_t n : edgeTris[edgeKey(t, e)]) {
                    if (chartOf[n] != kNone || queuedFor[n] == chart) continue;
                    // A collapsed triangle has no facing of its own and joins any neighbour.
                    float facing = normal[n].lengthSquared() == 0.0f ? 1.0f : dot(normal[n], axis);
                    if (facing < cosLimit) continue;
                    queuedFor[n] = chart;
                    queue.emplace(facing, n);
                }
        }
    }
    return charts;
}

bool packRectangles(std::vector<PackRect> &rects, float texelsPerUnit, int resolution,
                    int padding) {
    const int64_t limit = resolution;
    std::vector<std::pair<int64_t, int64_t>> size(rects.size());
    for (size_t i = 0; i < rects.size(); ++i) {
        double w = std::floor(double(rects[i].width) * texelsPerUnit);
        double h = std::floor(double(rects[i].height) * texelsPerUnit);
        if (!(w >= 0.0 && h >= 0.0) || w > double(limit) || h > double(limit)) return false;
        size[i] = {int64_t(w) + 1 + padding, int64_t(h) + 1 + padding};
    }
    std::vector<size_t> order(rects.size());
    for (size_t i = 0; i < order.size(); ++i) order[i] = i;
    std::stable_sort(order.begin(), order.end(), [&](size_t a, size_t b) {
        return size[a].second != size[b].second ? size[a].second > size[b].second
                                                : size[a].first > size[b].first;
    });
    // Skyline: segments (x, width, top) from left to right, covering [padding, resolution).
    struct Segment {
        int64_t x, width, top;
    };
    std::vector<Segment> sky{{padding, limit - padding, padding}};
    struct Spot {
        int64_t top = std::numeric_limits<int64_t>::max(), x = 0;
        size_t seg = 0;
    };
    // The lowest place for a block of w x h on the skyline (leftmost among equals).
    auto findSpot = [&](int64_t w, int64_t h) {
        Spot best;
        for (size_t s = 0; s < sky.size(); ++s) {
            int64_t x = sky[s].x;
            if (x + w > limit) break;
            int64_t y = 0, covered = 0;
            for (size_t k = s; k < sky.size() && covered < w; ++k) {
                y = std::max(y, sky[k].top);
                covered = sky[k].x + sky[k].width - x;
            }
            if (y + h > limit) continue;
            if (y + h < best.top || (y + h == best.top && x < best.x)) best = {y + h, x, s};
        }
        return best;
    };
    for (size_t i : order) {
        auto [w, h] = size[i];
        Spot spot = findSpot(w, h);
        // A block turned by a quarter may sit lower.
        rects[i].rotated = false;
        if (w != h) {
            Spot turned = findSpot(h, w);
            if (turned.top < spot.top || (turned.top == spot.top && turned.x < spot.x)) {
                spot = turned;
                std::swap(w, h);
                rects[i].rotated = true;
            }
        }
        if (spot.top == std::numeric_limits<int64_t>::max()) return false;
        const int64_t bestTop = spot.top, bestX = spot.x;
        const size_t bestSeg = spot.seg;
        rects[i].x = int32_t(bestX);
        rects[i].y = int32_t(bestTop - h);
        // Replace the covered part of the skyline by one segment at the new top.
        Segment added{bestX, w, bestTop};
        std::vector<Segment> next;
        next.reserve(sky.size() + 2);
        for (size_t s = 0; s < sky.size(); ++s) {
            const Segment &g = sky[s];
            int64_t g0 = g.x, g1 = g.x + g.width;
            if (g1 <= bestX || g0 >= bestX + w) {
                if (s == bestSeg) next.push_back(added);
                next.push_back(g);
                continue;
            }
            if (g0 < bestX) next.push_back({g0, bestX - g0, g.top});
            if (s == bestSeg) next.push_back(added);
            if (g1 > bestX + w) next.push_back({bestX + w, g1 - bestX - w, g.top});
        }
        // Merge neighbours of one height.
        sky.clear();
        for (const Segment &g : next) {
            if (!sky.empty() && sky.back().top == g.top && sky.back().x + sky.back().width == g.x)
                sky.back().width += g.width;
            else
                sky.push_back(g);
        }
    }
    return true;
}

bool generateLightmapLayout(const std::vector<Vec3> &positions,
                            const std::vector<uint32_t> &triangles, const LightmapOptions &options,
                            LightmapLayout &layout) {
    if (options.resolution < 8 || options.resolution > 65536) {
        message(kMsgError, 6, "Light-map resolution %d is out of range (8 to 65536)",
                options.resolution);
        return false;
    }
    if (options.padding < 0 || options.padding * 4 >= options.resolution) {
        message(kMsgError, 6, "Light-map padding %d does not suit resolution %d", options.padding,
                options.resolution);
        return false;
    }
    for (uint32_t i : triangles)
        if (i >= positions.size()) {
            message(kMsgError, 6, "Light-map layout given a triangle with a vertex out of range");
            return false;
        }
    const size_t triCount = triangles.size() / 3;
    LightmapLayout out;
    std::vector<Vec3> axes;
    out.chartCount =
        buildCharts(positions, triangles, options.maxChartAngleDegrees, out.chartOf, axes);

    // Each chart flattened in the plane of its first triangle, then turned so that its
    // bounding rectangle is the smallest over the directions of its hull edges.
    std::vector<std::vector<uint32_t>> chartTris(out.chartCount);
    for (size_t t = 0; t < triCount; ++t) chartTris[out.chartOf[t]].push_back(uint32_t(t));
    std::vector<Vec2> local(triCount * 3);
    std::vector<PackRect> rects(out.chartCount);
    double surfaceArea = 0.0;
    for (uint32_t c = 0; c < out.chartCount; ++c) {
        const std::vector<uint32_t> &tris = chartTris[c];
        const Vec3 axis = axes[c];
        for (uint32_t t : tris) {
            float a;
            unitNormal(positions[triangles[3 * t]], positions[triangles[3 * t + 1]],
                       positions[triangles[3 * t + 2]], a);
            surfaceArea += a;
        }
        const Vec3 u = perpendicular(axis), v = cross(axis, u);
        std::vector<Vec2> pts;
        pts.reserve(tris.size() * 3);
        for (uint32_t t : tris)
            for (int k = 0; k < 3; ++k) {
                const Vec3 &p = positions[triangles[3 * t + k]];
                local[3 * t + k] = Vec2(dot(p, u), dot(p, v));
                pts.push_back(local[3 * t + k]);
            }
        // Convex hull (monotone chain) for the rotation search.
        std::sort(pts.begin(), pts.end(), [](const Vec2 &a, const Vec2 &b) {
            return a.x < b.x || (a.x == b.x && a.y < b.y);
        });
        std::vector<Vec2> hull(2 * pts.size() + 1);
        size_t k = 0;
        for (size_t i = 0; i < pts.size(); ++i) {
            while (k >= 2 && cross2(hull[k - 2], hull[k - 1], pts[i]) <= 0) --k;
            hull[k++] = pts[i];
        }
        for (size_t i = pts.size() - 1, lower = k + 1; i-- > 0;) {
            while (k >= lower && cross2(hull[k - 2], hull[k - 1], pts[i]) <= 0) --k;
            hull[k++] = pts[i];
        }
        hull.resize(k > 1 ? k - 1 : k);
        float bestCos = 1.0f, bestSin = 0.0f;
        double bestRect = std::numeric_limits<double>::max();
        for (size_t i = 0; i < hull.size(); ++i) {
            Vec2 e = hull[(i + 1) % hull.size()] - hull[i];
            double len = std::sqrt(double(e.x) * e.x + double(e.y) * e.y);
            if (len == 0.0) continue;
            float cs = float(e.x / len), sn = float(e.y / len);
            float x0 = 1e30f, x1 = -1e30f, y0 = 1e30f, y1 = -1e30f;
            for (const Vec2 &p : hull) {
                float x = p.x * cs + p.y * sn, y = -p.x * sn + p.y * cs;
                x0 = std::min(x0, x), x1 = std::max(x1, x), y0 = std::min(y0, y),
                y1 = std::max(y1, y);
            }
            double rect = double(x1 - x0) * double(y1 - y0);
            if (rect < bestRect) bestRect = rect, bestCos = cs, bestSin = sn;
        }
        float x0 = 1e30f, x1 = -1e30f, y0 = 1e30f, y1 = -1e30f;
        for (uint32_t t : tris)
            for (int j = 0; j < 3; ++j) {
                Vec2 &p = local[3 * t + j];
                p = Vec2(p.x * bestCos + p.y * bestSin, -p.x * bestSin + p.y * bestCos);
                x0 = std::min(x0, p.x), x1 = std::max(x1, p.x), y0 = std::min(y0, p.y),
                y1 = std::max(y1, p.y);
            }
        // Charts lie wider than tall, which suits the skyline packer.
        const bool turn = (y1 - y0) > (x1 - x0);
        for (uint32_t t : tris)
            for (int j = 0; j < 3; ++j) {
                Vec2 &p = local[3 * t + j];
                p = turn ? Vec2(p.y - y0, x1 - p.x) : Vec2(p.x - x0, p.y - y0);
            }
        rects[c].width = turn ? y1 - y0 : x1 - x0;
        rects[c].height = turn ? x1 - x0 : y1 - y0;
    }

    // The largest scale at which the charts still fit, found by bisection.
    const int res = options.resolution, pad = options.padding;
    if (!packRectangles(rects, 0.0f, res, pad)) {
        message(kMsgError, 6,
                "%u light-map charts do not fit into %dx%d texels with %d texels of padding",
                out.chartCount, res, res, pad);
        return false;
    }
    double lo = 0.0, hi = surfaceArea > 0.0 ? double(res) / std::sqrt(surfaceArea) : 1.0;
    while (packRectangles(rects, float(hi), res, pad) && hi < 1e30) lo = hi, hi *= 2.0;
    for (int i = 0; i < 40 && hi - lo > lo * 1e-4; ++i) {
        double mid = 0.5 * (lo + hi);
        if (packRectangles(rects, float(mid), res, pad))
            lo = mid;
        else
            hi = mid;
    }
    packRectangles(rects, float(lo), res, pad);
    out.texelsPerUnit = float(lo);

    out.cornerUVs.resize(triCount * 3);
    double covered = 0.0;
    float stretch = 1.0f;
    const float inv = 1.0f / float(res);
    for (size_t t = 0; t < triCount; ++t) {
        const PackRect &r = rects[out.chartOf[t]];
        for (int k = 0; k < 3; ++k) {
            // A turned chart is rotated by a quarter turn, which keeps the triangles' winding.
            const Vec2 &q = local[3 * t + k];
            const Vec2 p = r.rotated ? Vec2(r.height - q.y, q.x) : q;
            out.cornerUVs[3 * t + k] = Vec2((float(r.x) + p.x * out.texelsPerUnit) * inv,
                                            (float(r.y) + p.y * out.texelsPerUnit) * inv);
        }
        const Vec2 *q = &out.cornerUVs[3 * t];
        covered += 0.5 * std::fabs(cross2(q[0], q[1], q[2]));
        float s = triangleStretch(positions[triangles[3 * t]], positions[triangles[3 * t + 1]],
                                  positions[triangles[3 * t + 2]], q[0], q[1], q[2]);
        if (std::isfinite(s)) stretch = std::max(stretch, s);
    }
    out.coverage = covered;
    out.largestStretch = stretch;
    layout = std::move(out);
    return true;
}

}  // namespace ox
