#include "core/types.h"

#include <gtest/gtest.h>

#include <cmath>

namespace ox {

TEST(Types, NormalizeKeepsZeroAndReachesUnitLength) {
    Vec3 zero;
    EXPECT_EQ(zero.normalized(), Vec3(0, 0, 0));
    Vec3 v = Vec3(3, 4, 12).normalized();
    EXPECT_NEAR(v.length(), 1.0f, 1e-6f);
    EXPECT_NEAR(v.x, 3.0f / 13.0f, 1e-6f);
}

TEST(Types, RowVectorMatricesPutTranslationLast) {
    Mtx4 t = Mtx4::translation({1, 2, 3});
    EXPECT_EQ(t.transformPoint({1, 1, 1}), Vec3(2, 3, 4));
    EXPECT_EQ(t.transformVector({1, 1, 1}), Vec3(1, 1, 1));
    // Scale then translate: row vectors apply the left matrix first.
    Mtx4 st = Mtx4::scale({2, 2, 2}) * t;
    EXPECT_EQ(st.transformPoint({1, 0, 0}), Vec3(3, 2, 3));
    Mtx4 inv;
    ASSERT_TRUE(st.inverse(inv));
    Vec3 back = inv.transformPoint({3, 2, 3});
    EXPECT_NEAR(back.x, 1.0f, 1e-6f);
    EXPECT_NEAR(back.y, 0.0f, 1e-6f);
    Mtx4 singular = Mtx4::scale({1, 0, 1});
    EXPECT_FALSE(singular.inverse(inv));
    EXPECT_LT(Mtx4::scale({-1, 1, 1}).determinant3(), 0.0f);
}

TEST(Types, EmptyBoxAndRegion) {
    BBox b;
    EXPECT_TRUE(b.isEmpty());
    EXPECT_FALSE(b.isValid());
    b.extend(Vec3(1, 2, 3));
    EXPECT_FALSE(b.isEmpty());
    EXPECT_EQ(b.min, b.max);
    Region r(0, 0, 4, 3);
    EXPECT_EQ(r.area(), 12);
    EXPECT_TRUE(r.contains(3, 2));
    EXPECT_FALSE(r.contains(4, 2));
    EXPECT_TRUE(Region(5, 5, 2, 2).isEmpty());
}

TEST(Types, GeneralInverseUndoesRotationScaleAndTranslation) {
    // Rotations about two axes, a non-uniform mirroring scale and a translation: M M^-1 = I.
    auto rotation = [](int axis, float a) {
        Mtx4 m;
        int i = (axis + 1) % 3, j = (axis + 2) % 3;
        m.m[i][i] = std::cos(a), m.m[i][j] = std::sin(a);
        m.m[j][i] = -std::sin(a), m.m[j][j] = std::cos(a);
        return m;
    };
    const Mtx4 cases[] = {rotation(0, 0.3f) * rotation(1, 1.1f) * Mtx4::scale({2.0f, -0.5f, 3.0f}) *
                              Mtx4::translation({4.0f, -7.0f, 0.25f}),
                          Mtx4::translation({-1.0f, 2.0f, 3.0f}) * rotation(2, -2.0f),
                          Mtx4::scale({1e-3f, 1e3f, 1.0f}) * rotation(1, 0.5f)};
    for (const Mtx4 &m : cases) {
        Mtx4 inv;
        ASSERT_TRUE(m.inverse(inv));
        for (const Mtx4 &product : {m * inv, inv * m})
            for (int r = 0; r < 4; ++r)
                for (int c = 0; c < 4; ++c)
                    EXPECT_NEAR(product.m[r][c], r == c ? 1.0f : 0.0f, 1e-5f) << r << ", " << c;
    }
}

TEST(Types, IndexingReachesEachComponent) {
    Vec3 v(1, 2, 3);
    v[1] = 5;
    EXPECT_EQ(v, Vec3(1, 5, 3));
    EXPECT_EQ(v[0] + v[2], 4.0f);
}

TEST(Types, RegionAndTileConvertAtTheEdges) {
    struct Case {
        Region region;
        Tile tile;
    };
    // A 1-pixel region, the last column and row of a 640 x 480 frame, a whole frame.
    const Case cases[] = {{Region(7, 9, 8, 10), Tile{7, 7, 9, 9, true}},
                          {Region(639, 0, 640, 480), Tile{639, 639, 0, 479, true}},
                          {Region(0, 479, 640, 480), Tile{0, 639, 479, 479, true}},
                          {Region(0, 0, 640, 480), Tile{0, 639, 0, 479, true}}};
    for (const Case &c : cases) {
        EXPECT_EQ(tileOfRegion(c.region), c.tile);
        EXPECT_EQ(regionOfTile(c.tile), c.region);
        EXPECT_EQ(regionOfTile(c.tile).area(), int64_t(c.tile.width()) * c.tile.height());
    }
    // Nothing to cover, or bounds that do not fit the other form.
    EXPECT_FALSE(tileOfRegion(Region(5, 5, 5, 9)).valid);
    EXPECT_FALSE(tileOfRegion(Region(0, 0, 4, 4, false)).valid);
    EXPECT_FALSE(tileOfRegion(Region(-1, 0, 4, 4)).valid);
    EXPECT_FALSE(regionOfTile(Tile{}).valid);
    EXPECT_FALSE(regionOfTile(Tile{0, UINT32_MAX, 0, 0, true}).valid);
    EXPECT_FALSE(regionOfTile(Tile{0, uint32_t(INT32_MAX), 0, 0, true}).valid);
    EXPECT_EQ(regionOfTile(Tile{0, uint32_t(INT32_MAX) - 1, 0, 0, true}).xMax, INT32_MAX);
}

}  // namespace ox
