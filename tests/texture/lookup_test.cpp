#include <gtest/gtest.h>

#include <cmath>
#include <functional>
#include <limits>

#include "texture/texture.h"

namespace {

/// A float grey image from a function of the texel (x, y from the bottom).
std::shared_ptr<ox::MipImage> greyImage(int w, int h, const std::function<float(int, int)> &f) {
    ox::TexelBuffer b;
    EXPECT_TRUE(b.allocate("test", w, h, {ox::TexelType::kF32, 1}));
    for (int y = 0; y < h; ++y)
        for (int x = 0; x < w; ++x) reinterpret_cast<float *>(b.row(y))[x] = f(x, y);
    auto img = std::make_shared<ox::MipImage>();
    EXPECT_TRUE(img->build("test", std::move(b), true, 32));
    return img;
}

TEST(MipChain, LevelSizesHalveToOneTexel) {
    using S = std::vector<ox::Vec2i>;
    EXPECT_EQ(ox::mipLevelSizes(1, 1), (S{{1, 1}}));
    EXPECT_EQ(ox::mipLevelSizes(4, 1), (S{{4, 1}, {2, 1}, {1, 1}}));
    EXPECT_EQ(ox::mipLevelSizes(5, 3), (S{{5, 3}, {2, 1}, {1, 1}}));
    EXPECT_EQ(ox::mipLevelSizes(1, 8), (S{{1, 8}, {1, 4}, {1, 2}, {1, 1}}));
    EXPECT_TRUE(ox::mipLevelSizes(0, 4).empty());
}

TEST(MipChain, BoxFilterKeepsTheMeanInEveryLayout) {
    // 6 x 3 of known values: the next level is 3 x 1 and folds the odd last row into it.
    const float v[3][6] = {{0, 1, 2, 3, 4, 5}, {6, 7, 8, 9, 10, 11}, {12, 13, 14, 15, 16, 17}};
    auto img = greyImage(6, 3, [&](int x, int y) { return v[y][x]; });
    ASSERT_EQ(img->levelCount(), 3);
    const ox::TexelBuffer &l1 = img->level(1);
    ASSERT_EQ(l1.width(), 3);
    ASSERT_EQ(l1.height(), 1);
    for (int x = 0; x < 3; ++x) {
        float sum = 0;
        for (int y = 0; y < 3; ++y) sum += v[y][2 * x] + v[y][2 * x + 1];
        EXPECT_FLOAT_EQ(l1.texel(x, 0).r, sum / 6) << x;
    }
    EXPECT_FLOAT_EQ(img->level(2).texel(0, 0).r, 8.5f);

    // 8-bit RGBA: exact rounding of 2 x 2 averages.
    ox::TexelBuffer b;
    ASSERT_TRUE(b.allocate("u8", 2, 2, {ox::TexelType::kU8, 4}));
    const uint8_t texels[16] = {0, 10, 255, 255, 1, 20, 255, 0, 2, 30, 255, 255, 3, 40, 255, 0};
    std::memcpy(b.data(), texels, 16);
    ox::MipImage m;
    ASSERT_TRUE(m.build("u8", std::move(b), false, 8));
    const uint8_t *t = m.level(1).data();
    EXPECT_EQ(t[0], 2);  // (0 + 1 + 2 + 3 + 2) / 4
    EXPECT_EQ(t[1], 25);
    EXPECT_EQ(t[2], 255);
    EXPECT_EQ(t[3], 128);
}

TEST(Lookups, BilinearBetweenFourKnownTexels) {
    // 2 x 2: bottom row 0, 1; top row 2, 3. Texel centres at 0.25 and 0.75.
    auto img = greyImage(2, 2, [](int x, int y) { return float(x + 2 * y); });
    ox::SimpleTexture tex(img);
    auto at = [&](float u, float v) { return tex.lookup({u, v}).r; };
    EXPECT_FLOAT_EQ(at(0.25f, 0.25f), 0.0f);
    EXPECT_FLOAT_EQ(at(0.75f, 0.75f), 3.0f);
    EXPECT_FLOAT_EQ(at(0.5f, 0.5f), 1.5f);
    EXPECT_FLOAT_EQ(at(0.5f, 0.25f), 0.5f);
    // A quarter of the way from x = 0 to 1, three quarters from y = 0 to 1.
    EXPECT_FLOAT_EQ(at(0.375f, 0.625f),
                    (0.75f * 0 + 0.25f * 1) * 0.25f + (0.75f * 2 + 0.25f * 3) * 0.75f);
    // The texture repeats: u = 1.25 is u = 0.25; between the edges it blends across the seam.
    EXPECT_FLOAT_EQ(at(1.25f, -0.75f), 0.0f);
    EXPECT_FLOAT_EQ(at(0.0f, 0.25f), 0.5f);
    // v = 0 is the bottom row, v = 1 (just below) the top row.
    ox::SimpleTexture nearest(img, true);
    EXPECT_FLOAT_EQ(nearest.lookup({0.1f, 0.0f}).r, 0.0f);
    EXPECT_FLOAT_EQ(nearest.lookup({0.1f, 0.99f}).r, 2.0f);
}

TEST(Lookups, EveryFilterAveragesACheckerboardAtAFootprintOfFourTexels) {
    auto img = greyImage(64, 64, [](int x, int y) { return float((x + y) & 1); });
    const float d = 4.0f / 64.0f;
    for (int mode : {1, 2, 3, 4}) {
        auto tex = ox::makeTexture(img, mode);
        for (float u : {0.1f, 0.33f, 0.5f, 0.77f})
            for (float v : {0.05f, 0.5f, 0.91f}) {
                EXPECT_NEAR(tex->lookup({u, v, d, 0, 0, d}).r, 0.5f, 0.005f)
                    << "mode " << mode << " at " << u << "," << v;
            }
    }
    // With no footprint the finest level shows the squares.
    auto mip = ox::makeTexture(img, 2);
    EXPECT_FLOAT_EQ(mip->lookup({0.5f / 64, 0.5f / 64}).r, 0.0f);
    EXPECT_FLOAT_EQ(mip->lookup({1.5f / 64, 0.5f / 64}).r, 1.0f);
}

TEST(Lookups, EWAFollowsAFootprintRotatedFortyFiveDegrees) {
    // Stripes 8 texels wide along the diagonal (1, 1): the value depends on x - y only.
    auto img = greyImage(64, 64, [](int x, int y) { return float(((x - y) & 15) < 8); });
    // At texel (36.5, 32.5) the point lies in the middle of a white stripe (x - y = 4).
    const float u = 36.5f / 64, v = 32.5f / 64;
    const float len = 16.0f / 64 / std::sqrt(2.0f), thin = 0.5f / 64 / std::sqrt(2.0f);
    // Long axis along the stripe, short axis across it: stays white.
    const ox::TextureLookup along{u, v, len, len, -thin, thin};
    // The same ellipse turned by 90 degrees crosses the stripes: about half grey.
    const ox::TextureLookup across{u, v, len, -len, thin, thin};
    ox::EWATexture ewa(img);
    EXPECT_GT(ewa.lookup(along).r, 0.9f);
    EXPECT_NEAR(ewa.lookup(across).r, 0.5f, 0.2f);
    ox::AnisoTexture aniso(img);
    EXPECT_GT(aniso.lookup(along).r, 0.9f);
    EXPECT_NEAR(aniso.lookup(across).r, 0.5f, 0.2f);
    // An isotropic filter sized by the long axis blurs both.
    ox::MipMapTexture mip(img);
    EXPECT_NEAR(mip.lookup(along).r, 0.5f, 0.2f);
}

TEST(Lookups, HostileCoordinatesGiveFiniteColours) {
    auto img = greyImage(8, 4, [](int x, int y) { return float(x * y); });
    const float inf = std::numeric_limits<float>::infinity(), nan = std::nanf("");
    const ox::TextureLookup cases[] = {{nan, nan},
                                       {inf, -inf},
                                       {1e30f, -1e30f},
                                       {0.5f, 0.5f, inf, 0, 0, 1},
                                       {0.5f, 0.5f, nan, nan, nan, nan},
                                       {0.5f, 0.5f, 1e30f, 1e30f, 1e-30f, 0},
                                       {0.5f, 0.5f, 1e6f, 0, 0, 1e6f},
                                       {-3.2f, 7.9f, 0.3f, -0.2f, 0.1f, 0.4f}};
    for (int mode = 0; mode <= 5; ++mode) {
        auto tex = ox::makeTexture(img, mode);
        for (const auto &c : cases) {
            const ox::Color col = tex->lookup(c);
            EXPECT_TRUE(std::isfinite(col.r) && col.r >= 0.0f && col.r <= 21.0f)
                << "mode " << mode << " u " << c.u;
        }
    }
}

TEST(Lookups, ReadPixelsCopiesRegionsInsideTheImageOnly) {
    auto img = greyImage(3, 2, [](int x, int y) { return float(x + 10 * y); });
    ox::MipMapTexture tex(img);
    ox::Color px[2];
    ASSERT_TRUE(tex.readPixels({1, 1, 3, 2}, px));
    EXPECT_FLOAT_EQ(px[0].r, 11.0f);
    EXPECT_FLOAT_EQ(px[1].r, 12.0f);
    EXPECT_FALSE(tex.readPixels({1, 1, 4, 2}, px));
}

}  // namespace
