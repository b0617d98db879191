#include "bake/bilinear_filter.h"

#include <gtest/gtest.h>

#include <cmath>

#include "bake/bake_sample.h"
#include "bake_test_util.h"
#include "core/message.h"
#include "render/frame.h"

namespace ox {
namespace {

/// A linear function of the world position: bilinear lookups of it are exact wherever the
/// four texels read hold it at their centres.
Color linearField(const Vec3 &p) { return {1.0f + 0.5f * p.x, 2.0f - 0.25f * p.y, 0.1f, 1.0f}; }

/// Resamples the field on the continued surface, as the bake run shades it.
class FieldResampler final : public SurfaceResampleInterface {
public:
    explicit FieldResampler(const std::vector<ResolvedBakeShape> &shapes) : shapes_(shapes) {}
    bool resample(const UvHit &hit, int32_t, int32_t, Color *out) override {
        BakeSurface s;
        fillBakeSurface(shapes_[size_t(hit.shape)], hit.triangle, hit.b1, hit.b2, -1, s);
        out[0] = linearField(s.position);
        ++calls;
        return true;
    }
    int calls = 0;

private:
    const std::vector<ResolvedBakeShape> &shapes_;
};

/// Fills "beauty" and "Z" the way a one-sample bake does.
void bakeField(Frame &frame, const UvMeshSearch &search,
               const std::vector<ResolvedBakeShape> &shapes) {
    LayerT<Color> *c = frame.addTiledLayer<Color>("beauty");
    LayerT<float> *z = frame.addTiledLayer<float>("Z");
    ASSERT_TRUE(c && z);
    for (int32_t y = 0; y < frame.height(); ++y)
        for (int32_t x = 0; x < frame.width(); ++x) {
            const UvHit hit = search.find(x + 0.5f, y + 0.5f);
            Color col{};
            float depth = -1.0f;
            if (hit.found()) {
                BakeSurface s;
                fillBakeSurface(shapes[size_t(hit.shape)], hit.triangle, hit.b1, hit.b2, -1, s);
                col = linearField(s.position);
                depth = float(hit.shape);
            }
            c->paste(Region(x, y, x + 1, y + 1), &col);
            z->paste(Region(x, y, x + 1, y + 1), &depth);
        }
}

/// A bilinear lookup of layer at texel-space point (px, py); covered tells whether all four
/// texels read are covered.
Color bilinear(Frame &frame, float px, float py, bool &covered) {
    const float fx = px - 0.5f, fy = py - 0.5f;
    const int32_t x0 = int32_t(std::floor(fx)), y0 = int32_t(std::floor(fy));
    const float tx = fx - float(x0), ty = fy - float(y0);
    Color sum{};
    covered = true;
    for (int dy = 0; dy < 2; ++dy)
        for (int dx = 0; dx < 2; ++dx) {
            const int32_t x = std::clamp(x0 + dx, 0, frame.width() - 1);
            const int32_t y = std::clamp(y0 + dy, 0, frame.height() - 1);
            Color c;
            float z;
            frame.readRegion("beauty", Region(x, y, x + 1, y + 1), &c);
            frame.readRegion("Z", Region(x, y, x + 1, y + 1), &z);
            covered = covered && z >= 0.0f;
            sum += c * ((dx ? tx : 1 - tx) * (dy ? ty : 1 - ty));
        }
    return sum;
}

TEST(BilinearFilter, LookupsInsideChartsReadTheContinuedSurface) {
    // Two charts of one plane: the left half of the plane in the lower left of the target, the
    // right half rotated by a quarter turn in the upper right; chart edges at odd texel
    // fractions.
    Scene scene;
    const Instance *left = test::place(scene,
                                       test::makeShape("l",
                                                       {{{-1, -1, 0}, {0, 0, 1}, {{0.05f, 0.07f}}},
                                                        {{0, -1, 0}, {0, 0, 1}, {{0.43f, 0.07f}}},
                                                        {{0, 1, 0}, {0, 0, 1}, {{0.43f, 0.45f}}},
                                                        {{-1, 1, 0}, {0, 0, 1}, {{0.05f, 0.45f}}}},
                                                       {{0, 1, 2}, {0, 2, 3}}, {"map"}),
                                       "left");
    const Instance *right = test::place(scene,
                                        test::makeShape("r",
                                                        {{{0, -1, 0}, {0, 0, 1}, {{0.93f, 0.55f}}},
                                                         {{1, -1, 0}, {0, 0, 1}, {{0.93f, 0.93f}}},
                                                         {{1, 1, 0}, {0, 0, 1}, {{0.55f, 0.93f}}},
                                                         {{0, 1, 0}, {0, 0, 1}, {{0.55f, 0.55f}}}},
                                                        {{0, 1, 2}, {0, 2, 3}}, {"map"}),
                                        "right");
    std::vector<ResolvedBakeShape> shapes(2);
    shapes[0].instance = left;
    shapes[1].instance = right;
    shapes[1].instanceIndex = 1;
    UvMeshSearch search;
    ASSERT_TRUE(search.build(shapes, UvRect{}, 64, 64, 1));
    Frame frame(64, 64);
    bakeField(frame, search, shapes);
    std::vector<float> before(64 * 64);
    frame.readRegion("Z", Region(0, 0, 64, 64), before.data());

    FieldResampler resampler(shapes);
    BilinearFilter filter({"beauty"}, search, resampler);
    ASSERT_TRUE(filter.run(frame, nullptr));
    EXPECT_EQ(filter.refilled(), resampler.calls);
    EXPECT_GT(filter.refilled(), 0);
    EXPECT_FALSE(frame.hasLayer("beauty_bilinear"));
    EXPECT_FALSE(frame.hasLayer("Z_bilinear"));

    // Only background texels next to covered ones changed.
    std::vector<float> after(64 * 64);
    frame.readRegion("Z", Region(0, 0, 64, 64), after.data());
    for (int32_t y = 0; y < 64; ++y)
        for (int32_t x = 0; x < 64; ++x) {
            const float b = before[size_t(y * 64 + x)], a = after[size_t(y * 64 + x)];
            if (b >= 0.0f) {
                EXPECT_EQ(a, b);
                continue;
            }
            bool next = false;
            for (int dy = -1; dy <= 1; ++dy)
                for (int dx = -1; dx <= 1; ++dx) {
                    const int nx = x + dx, ny = y + dy;
                    next = next || (nx >= 0 && ny >= 0 && nx < 64 && ny < 64 &&
                                    before[size_t(ny * 64 + nx)] >= 0.0f);
                }
            EXPECT_EQ(a >= 0.0f, next) << x << "," << y;
        }

    // Every lookup inside either chart reads four covered texels and the field itself,
    // right up to the chart borders (the seam between the two halves included).
    for (int i = 0; i <= 200; ++i) {
        const float t = float(i) / 200.0f;
        for (float s : {0.0f, 0.001f, 0.3f, 0.999f, 1.0f}) {
            const Vec3 onLeft{-1.0f + s, -1.0f + 2.0f * t, 0.0f};  // u 0.05..0.43
            const Vec3 onRight{s, -1.0f + 2.0f * t, 0.0f};
            const float lu = (0.05f + 0.38f * s) * 64, lv = (0.07f + 0.38f * t) * 64;
            const float ru = (0.93f - 0.38f * t) * 64, rv = (0.55f + 0.38f * s) * 64;
            bool covered;
            Color c = bilinear(frame, lu, lv, covered);
            EXPECT_TRUE(covered) << "left " << s << "," << t;
            EXPECT_NEAR(c.r, linearField(onLeft).r, 1e-4f);
            EXPECT_NEAR(c.g, linearField(onLeft).g, 1e-4f);
            c = bilinear(frame, ru, rv, covered);
            EXPECT_TRUE(covered) << "right " << s << "," << t;
            EXPECT_NEAR(c.r, linearField(onRight).r, 1e-4f);
            EXPECT_NEAR(c.g, linearField(onRight).g, 1e-4f);
        }
    }
}

TEST(BilinearFilter, MissingLayersFailAndLeaveTheFrame) {
    Scene scene;
    std::vector<ResolvedBakeShape> shapes(1);
    shapes[0].instance = test::place(scene, test::makeQuad("q", 0, 0, 1, 1), "q");
    UvMeshSearch search;
    ASSERT_TRUE(search.build(shapes, UvRect{}, 8, 8, 1));
    FieldResampler resampler(shapes);
    Frame frame(8, 8);
    frame.addTiledLayer<Color>("beauty");
    BilinearFilter filter({"beauty"}, search, resampler);
    testing::internal::CaptureStdout();
    EXPECT_FALSE(filter.run(frame, nullptr));
    frame.addTiledLayer<float>("Z");
    BilinearFilter other({"tpAlbedo"}, search, resampler);
    EXPECT_FALSE(other.run(frame, nullptr));
    const std::string out = testing::internal::GetCapturedStdout();
    EXPECT_NE(out.find("Source Z layer not found in bilinear filter"), std::string::npos);
    EXPECT_NE(out.find("Source layer tpAlbedo not found in bilinear filter"), std::string::npos);
    EXPECT_EQ(frame.layerNames(), (std::vector<std::string>{"Z", "beauty"}));
}

}  // namespace
}  // namespace ox
