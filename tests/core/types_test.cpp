#include "core/types.h"

#include <gtest/gtest.h>

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

}  // namespace ox
