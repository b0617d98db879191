#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <limits>

#include "raytrace/intersect_wide.h"
#include "tests/raytrace/test_meshes.h"

namespace ox {
namespace {

// Float bits, so that equal answers mean the same bits (and NaN lanes compare).
uint32_t bitsOf(float f) {
    uint32_t b;
    std::memcpy(&b, &f, sizeof b);
    return b;
}

__attribute__((target("avx2"))) int widePair(const IntersectTriangle *tris, const TraceRay &r,
                                             float tmax, float *t, float *u, float *v) {
    IntersectWideTriangle pk = IntersectWideTriangle::load(tris, tris + 4);
    __m256 wt, wu, wv;
    int mask = intersectPacketPair(pk, r, tmax, wt, wu, wv);
    _mm256_storeu_ps(t, wt), _mm256_storeu_ps(u, wu), _mm256_storeu_ps(v, wv);
    return mask;
}

// Every lane of the four- and eight-wide tests gives the single-triangle test's answer with its
// bits, over triangles around the ray with every culling rule, invisible flags, degenerate and
// NaN corners, inside instances (flags overridden) and outside.
TEST(IntersectTest, PackedAndWideLanesMatchTheSingleTriangleTest) {
    testmesh::Rng rng(99);
    const BBox around({-1.0f, -1.0f, -1.0f}, {1.0f, 1.0f, 1.0f});
    const uint32_t flagChoices[] = {kFlagDoubleSided | 0x1, 0x1, kFlagOpposite | 0x1, 0x2,
                                    kFlagDoubleSided | kFlagOpposite | 0x1};
    const bool wide = wideTestsAvailable();
    int hits = 0;
    for (int round = 0; round < 4000; ++round) {
        alignas(16) IntersectTriangle tris[8];
        for (int i = 0; i < 8; ++i) {
            IntersectTriangle &t = tris[i];
            t.p0 = rng.inBox(around);
            t.e1 = rng.inBox(around) - t.p0;
            t.e2 = rng.inBox(around) - t.p0;
            if ((round + i) % 23 == 0) t.e2 = t.e1 * 0.5f;  // degenerate: det 0
            if ((round + i) % 31 == 0) t.p0.y = std::numeric_limits<float>::quiet_NaN();
            t.flags = flagChoices[(round * 8 + i) % 5];
        }
        TraceRay r;
        Vec3 origin = rng.inBox(BBox({-3.0f, -3.0f, -3.0f}, {3.0f, 3.0f, 3.0f}));
        Vec3 towards = rng.inBox(BBox({-0.5f, -0.5f, -0.5f}, {0.5f, 0.5f, 0.5f}));
        ASSERT_TRUE(r.prepare(origin, (towards - origin).normalized(), 0x1, 0.0f));
        if (round % 7 == 3) r.setInstanceFlags(flagChoices[round % 5]);
        const float tmax = round % 3 ? kInfiniteDistance : 2.0f + rng.uniform();
        float st[8], su[8], sv[8];
        int single = 0;
        for (int i = 0; i < 8; ++i)
            if (intersectTriangle(tris[i], r, tmax, st[i], su[i], sv[i])) single |= 1 << i;
        hits += __builtin_popcount(single);
        for (int half = 0; half < 2; ++half) {
            float4 t, u, v;
            int mask =
                intersectPacket(IntersectSSETriangle::load(tris + 4 * half), r, tmax, t, u, v);
            ASSERT_EQ(mask, single >> (4 * half) & 15) << "round " << round;
            alignas(16) float pt[4], pu[4], pv[4];
            _mm_store_ps(pt, t), _mm_store_ps(pu, u), _mm_store_ps(pv, v);
            for (int i = 0; i < 4; ++i)
                if (mask >> i & 1) {
                    ASSERT_EQ(bitsOf(pt[i]), bitsOf(st[4 * half + i])) << "round " << round;
                    ASSERT_EQ(bitsOf(pu[i]), bitsOf(su[4 * half + i])) << "round " << round;
                    ASSERT_EQ(bitsOf(pv[i]), bitsOf(sv[4 * half + i])) << "round " << round;
                }
        }
        if (!wide) continue;
        float wt[8], wu[8], wv[8];
        int mask = widePair(tris, r, tmax, wt, wu, wv);
        ASSERT_EQ(mask, single) << "round " << round;
        for (int i = 0; i < 8; ++i)
            if (mask >> i & 1) {
                ASSERT_EQ(bitsOf(wt[i]), bitsOf(st[i])) << "round " << round;
                ASSERT_EQ(bitsOf(wu[i]), bitsOf(su[i])) << "round " << round;
                ASSERT_EQ(bitsOf(wv[i]), bitsOf(sv[i])) << "round " << round;
            }
    }
    EXPECT_GT(hits, 2000);
}

// The switch: off always works; on only where the processor has AVX2; prepared rays carry it.
TEST(IntersectTest, PrepareRejectsUnusableRaysAndKeepsZeroComponentsFinite) {
    const float inf = std::numeric_limits<float>::infinity(), nan = std::nanf("");
    struct Case {
        Vec3 o, d;
        bool usable;
    };
    const Case cases[] = {
        {{0, 0, 0}, {0, 0, 0}, false},
        {{0, 0, 0}, {1e-30f, 0, 0}, false},
        {{inf, 0, 0}, {0, 0, 1}, false},
        {{0, nan, 0}, {0, 0, 1}, false},
        {{0, 0, -inf}, {0, 0, 1}, false},
        {{0, 0, 0}, {nan, 0, 1}, false},
        {{0, 0, 0}, {0, inf, 1}, false},
        {{0, 0, 0}, {0, 0, -inf}, false},
        {{1, 2, 3}, {0, 0, -1}, true},
        {{-1, 0, 5}, {3, -0.0f, 0.25f}, true},
        {{1e30f, -1e30f, 0}, {-7, 3, 1e-3f}, true},
    };
    for (const Case &c : cases) {
        TraceRay r;
        ASSERT_EQ(r.prepare(c.o, c.d, 1, 0.5f), c.usable) << c.d.x << " " << c.d.y << " " << c.d.z;
        if (!c.usable) continue;
        const float d[3] = {c.d.x, c.d.y, c.d.z}, inv[3] = {r.inv.x, r.inv.y, r.inv.z};
        for (int a = 0; a < 3; ++a) EXPECT_EQ(inv[a], d[a] != 0.0f ? 1.0f / d[a] : 1e30f);
    }
}

TEST(IntersectTest, WideTestsSwitch) {
    TraceRay r;
    EXPECT_FALSE(setWideTests(false));
    ASSERT_TRUE(r.prepare({0, 0, 0}, {0, 0, 1}, 1, 0.0f));
    EXPECT_FALSE(r.wide);
    EXPECT_EQ(setWideTests(true), wideTestsAvailable());
    ASSERT_TRUE(r.prepare({0, 0, 0}, {0, 0, 1}, 1, 0.0f));
    EXPECT_EQ(r.wide, wideTestsAvailable());
}

}  // namespace
}  // namespace ox
