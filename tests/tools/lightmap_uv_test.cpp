#include "tools/lightmap_uv.h"

#include <gtest/gtest.h>

#include <array>
#include <cmath>
#include <numbers>
#include <vector>

#include "core/message.h"

namespace {

using ox::Vec2;
using ox::Vec3;

struct Mesh {
    std::vector<Vec3> positions;
    std::vector<uint32_t> triangles;
    void quad(uint32_t a, uint32_t b, uint32_t c, uint32_t d) {
        triangles.insert(triangles.end(), {a, b, c, a, c, d});
    }
};

Mesh cube() {
    Mesh m;
    for (int i = 0; i < 8; ++i)
        m.positions.push_back(Vec3(i & 1 ? 1.f : -1.f, i & 2 ? 1.f : -1.f, i & 4 ? 1.f : -1.f));
    m.quad(0, 2, 3, 1), m.quad(4, 5, 7, 6), m.quad(0, 1, 5, 4);
    m.quad(2, 6, 7, 3), m.quad(1, 3, 7, 5), m.quad(0, 4, 6, 2);
    return m;
}

// A closed cylinder side of n segments and rings rings, sharing vertices.
Mesh cylinder(int n, int rings) {
    Mesh m;
    for (int r = 0; r <= rings; ++r)
        for (int i = 0; i < n; ++i) {
            float a = 2.0f * std::numbers::pi_v<float> * float(i) / float(n);
            m.positions.push_back(Vec3(std::cos(a), float(r) * 0.3f, std::sin(a)));
        }
    for (int r = 0; r < rings; ++r)
        for (int i = 0; i < n; ++i) {
            uint32_t a = uint32_t(r * n + i), b = uint32_t(r * n + (i + 1) % n);
            m.quad(a, a + uint32_t(n), b + uint32_t(n), b);
        }
    return m;
}

// A flat ramp that winds around twice while rising slowly: every face looks up, yet the turns
// lie over each other when projected onto the ground.
Mesh helix() {
    Mesh m;
    const int steps = 96;
    for (int i = 0; i <= steps; ++i) {
        float a = 4.0f * std::numbers::pi_v<float> * float(i) / float(steps);
        float y = 0.02f * float(i) / float(steps);
        m.positions.push_back(Vec3(std::cos(a), y, std::sin(a)));
        m.positions.push_back(Vec3(2.0f * std::cos(a), y, 2.0f * std::sin(a)));
    }
    for (int i = 0; i < steps; ++i) {
        uint32_t a = uint32_t(2 * i);
        m.quad(a, a + 2, a + 3, a + 1);
    }
    return m;
}

// Interiors of two triangles overlap (shared edges and corners do not count).
bool overlap(const Vec2 *a, const Vec2 *b) {
    const Vec2 *t[2] = {a, b};
    for (int k = 0; k < 2; ++k)
        for (int e = 0; e < 3; ++e) {
            Vec2 p = t[k][e], q = t[k][(e + 1) % 3];
            double nx = -(double(q.y) - p.y), ny = double(q.x) - p.x;
            double a0 = 1e30, a1 = -1e30, b0 = 1e30, b1 = -1e30;
            for (int i = 0; i < 3; ++i) {
                double da = a[i].x * nx + a[i].y * ny, db = b[i].x * nx + b[i].y * ny;
                a0 = std::min(a0, da), a1 = std::max(a1, da), b0 = std::min(b0, db),
                b1 = std::max(b1, db);
            }
            // Touching within rounding (a millionth of the square) does not count.
            double eps = 1e-6 * std::sqrt(nx * nx + ny * ny);
            if (a1 <= b0 + eps || b1 <= a0 + eps) return false;
        }
    return true;
}

// Texel boxes (inclusive x0, y0, x1, y1) keep `pad` texels from each other and from the low
// border, and from the high border too but for `slack` texels.
void expectGutters(const std::vector<std::array<int, 4>> &boxes, int pad, int res, int slack) {
    for (size_t a = 0; a < boxes.size(); ++a) {
        const auto &p = boxes[a];
        EXPECT_TRUE(p[0] >= pad && p[1] >= pad && p[2] + pad < res + slack &&
                    p[3] + pad < res + slack)
            << a;
        for (size_t b = a + 1; b < boxes.size(); ++b) {
            const auto &q = boxes[b];
            EXPECT_TRUE(q[0] - p[2] - 1 >= pad || p[0] - q[2] - 1 >= pad ||
                        q[1] - p[3] - 1 >= pad || p[1] - q[3] - 1 >= pad)
                << a << " " << b;
        }
    }
}

// Checks what every layout must hold: UVs inside the square, no two triangles overlapping,
// and charts at least `padding` whole texels apart (and from the border).
void checkLayout(const Mesh &m, const ox::LightmapOptions &o, const ox::LightmapLayout &l) {
    const size_t tris = m.triangles.size() / 3;
    ASSERT_EQ(l.cornerUVs.size(), tris * 3);
    ASSERT_EQ(l.chartOf.size(), tris);
    for (const Vec2 &uv : l.cornerUVs)
        EXPECT_TRUE(uv.x >= 0 && uv.x <= 1 && uv.y >= 0 && uv.y <= 1) << uv.x << " " << uv.y;
    for (size_t a = 0; a < tris; ++a)
        for (size_t b = a + 1; b < tris; ++b)
            EXPECT_FALSE(overlap(&l.cornerUVs[3 * a], &l.cornerUVs[3 * b])) << a << " " << b;
    // Texel ranges each chart touches (a corner on a texel's far edge counts in the next one).
    const float res = float(o.resolution);
    std::vector<std::array<int, 4>> range(l.chartCount, {1 << 30, 1 << 30, -1, -1});
    for (size_t t = 0; t < tris; ++t)
        for (int k = 0; k < 3; ++k) {
            const Vec2 &uv = l.cornerUVs[3 * t + k];
            auto &r = range[l.chartOf[t]];
            int x = int(std::floor(uv.x * res)), y = int(std::floor(uv.y * res));
            r[0] = std::min(r[0], x), r[1] = std::min(r[1], y);
            r[2] = std::max(r[2], x), r[3] = std::max(r[3], y);
        }
    expectGutters(range, o.padding, o.resolution, 1);
}

}  // namespace

TEST(LightmapUv, CubeGetsOneChartPerFaceWithoutStretch) {
    Mesh m = cube();
    ox::LightmapOptions o;
    o.resolution = 64;
    ox::LightmapLayout l;
    ASSERT_TRUE(ox::generateLightmapLayout(m.positions, m.triangles, o, l));
    EXPECT_EQ(l.chartCount, 6u);
    EXPECT_NEAR(l.largestStretch, 1.0f, 1e-4f);
    // Six squares of side 2 at one density; each block is floor(2s) + 1 + 2 texels wide.
    EXPECT_GT(l.coverage, 0.3);
    EXPECT_NEAR(l.coverage, 6.0 * 4.0 * l.texelsPerUnit * l.texelsPerUnit / (64.0 * 64.0), 1e-3);
    checkLayout(m, o, l);
    // The two triangles of a face share a chart; triangles of different faces do not.
    for (size_t f = 0; f < 6; ++f) EXPECT_EQ(l.chartOf[2 * f], l.chartOf[2 * f + 1]);
}

TEST(LightmapUv, CurvedSurfacesSplitByAngleWithoutFolding) {
    // A cylinder: each chart spans at most 2 * angle of the circle, so it takes at least
    // 360 / (2 angle). The helix: all faces look up, but one flat chart would put the two turns
    // on each other.
    const struct {
        Mesh mesh;
        int resolution;
        float angle;
        uint32_t minCharts;
    } cases[] = {{cylinder(32, 4), 256, 20.0f, 9},
                 {cylinder(32, 4), 256, 45.0f, 4},
                 {cylinder(32, 4), 256, 70.0f, 3},
                 {helix(), 512, 60.0f, 2}};
    for (const auto &c : cases) {
        ox::LightmapOptions o;
        o.resolution = c.resolution;
        o.maxChartAngleDegrees = c.angle;
        ox::LightmapLayout l;
        ASSERT_TRUE(ox::generateLightmapLayout(c.mesh.positions, c.mesh.triangles, o, l));
        EXPECT_GE(l.chartCount, c.minCharts) << c.angle;
        EXPECT_LE(l.largestStretch,
                  1.0f / std::cos(c.angle * std::numbers::pi_v<float> / 180.0f) + 1e-3f);
        checkLayout(c.mesh, o, l);
    }
}

TEST(LightmapUv, DegenerateTrianglesAndTinyResolutions) {
    ox::resetMessageFilters();
    ox::setTypeEnabled(ox::kMsgError, false);
    Mesh m = cube();
    // A collapsed triangle and one with two equal corners join the layout without harm.
    m.positions.push_back(Vec3(0, 0, 0));
    m.triangles.insert(m.triangles.end(), {0, 0, 1, 8, 8, 8});
    ox::LightmapOptions o;
    o.resolution = 32;
    ox::LightmapLayout l;
    ASSERT_TRUE(ox::generateLightmapLayout(m.positions, m.triangles, o, l));
    for (const Vec2 &uv : l.cornerUVs) EXPECT_TRUE(std::isfinite(uv.x) && std::isfinite(uv.y));

    // Too many charts for the square: a clean failure.
    Mesh many;
    for (int i = 0; i < 200; ++i) {
        uint32_t b = uint32_t(many.positions.size());
        float x = float(i) * 3.0f;
        many.positions.insert(many.positions.end(),
                              {Vec3(x, 0, 0), Vec3(x + 1, 0, 0), Vec3(x, 1, 0)});
        many.triangles.insert(many.triangles.end(), {b, b + 1, b + 2});
    }
    o.resolution = 16;
    EXPECT_FALSE(ox::generateLightmapLayout(many.positions, many.triangles, o, l));
    // Out-of-range input is refused rather than read.
    o.resolution = 64;
    std::vector<uint32_t> bad = {0, 1, 99};
    EXPECT_FALSE(ox::generateLightmapLayout(m.positions, bad, o, l));
    o.resolution = 4;
    EXPECT_FALSE(ox::generateLightmapLayout(m.positions, m.triangles, o, l));
    ox::resetMessageFilters();
}

TEST(LightmapUv, StretchOfKnownMaps) {
    const Vec3 p0(0, 0, 0), p1(1, 0, 0), p2(0, 1, 0);
    EXPECT_FLOAT_EQ(ox::triangleStretch(p0, p1, p2, Vec2(0, 0), Vec2(1, 0), Vec2(0, 1)), 1.0f);
    // Squeezed to half in one direction: the singular values are 1 and 2.
    EXPECT_FLOAT_EQ(ox::triangleStretch(p0, p1, p2, Vec2(0, 0), Vec2(0.5f, 0), Vec2(0, 1)), 2.0f);
    // A uniform scale or a rotation does not stretch.
    EXPECT_NEAR(ox::triangleStretch(p0, p1, p2, Vec2(0, 0), Vec2(0, 3), Vec2(-3, 0)), 1.0f, 1e-6f);
    EXPECT_TRUE(std::isinf(ox::triangleStretch(p0, p1, p2, Vec2(0, 0), Vec2(1, 1), Vec2(2, 2))));
}

TEST(LightmapUv, PackedRectanglesKeepTheirGutters) {
    std::vector<ox::PackRect> rects;
    for (int i = 0; i < 40; ++i) rects.push_back({float(1 + i % 7), float(1 + (i * 3) % 5)});
    const int res = 128, pad = 3;
    const float scale = 2.0f;
    ASSERT_TRUE(ox::packRectangles(rects, scale, res, pad));
    // Texel boxes of the placed blocks' content, turned when the packer turned it.
    std::vector<std::array<int, 4>> boxes;
    int turned = 0;
    for (const ox::PackRect &r : rects) {
        int w = int(std::floor(r.width * scale)) + 1, h = int(std::floor(r.height * scale)) + 1;
        if (r.rotated) std::swap(w, h);
        boxes.push_back({r.x, r.y, r.x + w - 1, r.y + h - 1});
        turned += r.rotated;
    }
    expectGutters(boxes, pad, res, 0);
    EXPECT_GT(turned, 0);  // this mix of shapes packs better with some blocks turned
    EXPECT_FALSE(ox::packRectangles(rects, 100.0f, res, pad));
}
