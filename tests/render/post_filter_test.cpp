#include "render/post_filter.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iterator>
#include <limits>
#include <random>
#include <string>
#include <vector>

#include "render/color_correction.h"
#include "render/frame.h"
#include "tests/render/fake_io.h"
#include "tests/support/test_support.h"

namespace {

using ox::Color;
using ox::Frame;
using ox::Region;

bool has(const std::string &text, const std::string &part) {
    return text.find(part) != std::string::npos;
}

/// The filters take a render context they do not use.
ox::RenderContext &noContext() {
    alignas(16) static char storage[16];
    return *reinterpret_cast<ox::RenderContext *>(storage);
}

constexpr float kBg = -1.0f;  // "Z" of a background texel

/// A frame with colour layers and a "Z" layer filled from the given rows (row 0 first), in
/// tiles of `tile` texels (results of filters get the default tiles).
std::unique_ptr<Frame> makeFrame(int w, int h, const std::vector<float> &z,
                                 const std::vector<std::pair<std::string, std::vector<Color>>> &l,
                                 int tile = 8) {
    auto f = std::make_unique<Frame>(w, h);
    EXPECT_TRUE(f->addTiledLayer<float>("Z", tile));
    EXPECT_TRUE(f->pasteRegion("Z", Region(0, 0, w, h), z.data()));
    for (const auto &[name, colors] : l) {
        EXPECT_TRUE(f->addTiledLayer<Color>(name, tile));
        EXPECT_TRUE(f->pasteRegion(name, Region(0, 0, w, h), colors.data()));
    }
    return f;
}

std::vector<Color> readColors(Frame &f, const std::string &name) {
    std::vector<Color> out(size_t(f.width()) * size_t(f.height()));
    EXPECT_TRUE(f.readRegion(name, Region(0, 0, f.width(), f.height()), out.data())) << name;
    return out;
}

bool sameBits(const std::vector<Color> &a, const std::vector<Color> &b) {
    return a.size() == b.size() && std::memcmp(a.data(), b.data(), a.size() * sizeof(Color)) == 0;
}

// ---------------------------------------------------------------------------------------------
// Edge dilation

/// Edge dilation as the plain ring search: every ring from 1 outwards, in ring order.
Color referenceDilation(const std::vector<float> &z, const std::vector<Color> &c, int w, int h,
                        int n, const Color &bg, int x, int y) {
    if (z[size_t(y * w + x)] >= 0.0f) return c[size_t(y * w + x)];
    for (int r = 1; r <= n; ++r) {
        float best = -3.4028235e38f;
        bool any = false;
        Color win = bg;
        auto visit = [&](int cx, int cy) {
            if (cx < 0 || cy < 0 || cx >= w || cy >= h || !(z[size_t(cy * w + cx)] >= 0.0f)) return;
            any = true;
            const Color &cc = c[size_t(cy * w + cx)];
            const float l = 0.299f * cc.r + 0.587f * cc.g + 0.114f * cc.b;
            if (l > best) best = l, win = cc;
        };
        for (int cy = y - r; cy <= y + r; ++cy) visit(x - r, cy);
        for (int cy = y - r; cy <= y + r; ++cy) visit(x + r, cy);
        for (int cx = x - r + 1; cx <= x + r - 1; ++cx) visit(cx, y + r);
        for (int cx = x - r + 1; cx <= x + r - 1; ++cx) visit(cx, y - r);
        if (any) return win;
    }
    return bg;
}

/// Dilates the one layer "beauty" of a frame; returns its result.
std::vector<Color> dilate(Frame &f, int n, const Color &bg, int threads = 1) {
    ox::EdgeDilationFilter filter({"beauty"}, n, bg);
    filter.setThreadCount(threads);
    EXPECT_TRUE(filter.run(f, nullptr));
    EXPECT_EQ(f.layerNames(), (std::vector<std::string>{"Z", "beauty"}));
    return readColors(f, "beauty");
}

TEST(EdgeDilationTest, RingOrderTiesBrightnessAndReach) {
    // A 7 x 7 frame; the texel under test is the centre (3, 3). All candidates are grey 0.5
    // (equal luminance) unless given; alpha tells which one won.
    const Color bg(0.1f, 0.2f, 0.3f, 0.0f);
    struct Covered {
        int x, y;
        Color c;
    };
    const Color g1(0.5f, 0.5f, 0.5f, 0.1f), g2(0.5f, 0.5f, 0.5f, 0.2f), g3(0.5f, 0.5f, 0.5f, 0.3f),
        g4(0.5f, 0.5f, 0.5f, 0.4f), bright(0.9f, 0.9f, 0.9f, 0.9f);
    struct Case {
        const char *what;
        int n;
        std::vector<Covered> covered;
        Color expected;
    } cases[] = {
        {"left column before the others", 2, {{4, 2, g2}, {3, 4, g3}, {3, 2, g4}, {2, 4, g1}}, g1},
        {"left column bottom to top", 2, {{2, 4, g2}, {2, 3, g1}}, g1},
        {"right column before the rows", 2, {{3, 4, g3}, {3, 2, g4}, {4, 4, g2}}, g2},
        {"right column bottom to top", 2, {{4, 4, g3}, {4, 2, g2}}, g2},
        {"top row before the bottom row", 2, {{3, 2, g4}, {3, 4, g3}}, g3},
        {"top row left to right", 2, {{3, 5, g2}, {4, 5, g1}}, g2},
        {"the brightest wins over the first", 2, {{2, 3, g1}, {3, 2, bright}}, bright},
        {"the first ring wins over a brighter second", 2, {{3, 2, g1}, {5, 3, bright}}, g1},
        {"second ring when the first is empty", 2, {{5, 5, g3}, {1, 3, g2}}, g2},
        {"nothing within n", 2, {{0, 3, bright}}, bg},
        {"n = 0", 0, {{3, 2, bright}}, bg},
        {"negative n", -3, {{3, 2, bright}}, bg},
    };
    for (const Case &k : cases) {
        std::vector<float> z(49, kBg);
        std::vector<Color> c(49, Color(7, 7, 7, 7));  // never seen in a result unless copied
        for (const Covered &cv : k.covered) {
            z[size_t(cv.y * 7 + cv.x)] = 1.0f;
            c[size_t(cv.y * 7 + cv.x)] = cv.c;
        }
        auto f = makeFrame(7, 7, z, {{"beauty", c}});
        const std::vector<Color> out = dilate(*f, k.n, bg);
        EXPECT_EQ(out[3 * 7 + 3], k.expected) << k.what;
        for (const Covered &cv : k.covered) EXPECT_EQ(out[size_t(cv.y * 7 + cv.x)], cv.c) << k.what;
    }
}

TEST(EdgeDilationTest, MatchesThePlainRingSearchOnRandomMasks) {
    std::mt19937 rng(1234);
    std::uniform_real_distribution<float> u(0.0f, 1.0f);
    const Color bg(0.25f, 0.0f, 1.0f, 0.5f);
    struct Shape {
        int w, h;
    } shapes[] = {{37, 23}, {64, 70}, {1, 40}, {90, 1}, {130, 3}};
    int compared = 0;
    for (const Shape &s : shapes) {
        for (float coverage : {0.01f, 0.2f, 0.85f}) {
            const size_t count = size_t(s.w) * size_t(s.h);
            std::vector<float> z(count);
            std::vector<Color> c(count);
            for (size_t i = 0; i < count; ++i) {
                const float p = u(rng);
                z[i] = p < coverage ? p : (p < 0.97f ? kBg : std::nanf(""));
                // Few grey levels, so that ties are common; alpha tells the texels apart.
                const float level = float(int(u(rng) * 3.0f)) * 0.25f;
                const float pick = u(rng);
                c[i] = pick < 0.8f    ? Color(level, level, level, float(i))
                       : pick < 0.98f ? Color(u(rng), u(rng), u(rng), float(i))
                                      : Color(std::nanf(""), -INFINITY, 1.0f, float(i));
            }
            for (int n : {0, 1, 2, 3, 5, 6, 7, 40}) {
                std::vector<Color> expected(count);
                for (int y = 0; y < s.h; ++y)
                    for (int x = 0; x < s.w; ++x)
                        expected[size_t(y * s.w + x)] =
                            referenceDilation(z, c, s.w, s.h, n, bg, x, y);
                // Small tiles go through band copies, default ones are worked in place.
                for (int tile : {8, ox::kLayerTileSize})
                    for (int threads : {1, 3}) {
                        auto f = makeFrame(s.w, s.h, z, {{"beauty", c}}, tile);
                        EXPECT_TRUE(sameBits(dilate(*f, n, bg, threads), expected))
                            << s.w << "x" << s.h << " coverage " << coverage << " n " << n
                            << " tile " << tile << " threads " << threads;
                        ++compared;
                    }
            }
        }
    }
    EXPECT_EQ(compared, 5 * 3 * 8 * 2 * 2);
}

TEST(EdgeDilationTest, SeveralLayersMissingLayersAndAbort) {
    const std::vector<float> z = {1, kBg, kBg, kBg};
    const std::vector<Color> a = {Color(1, 0, 0, 1), {}, {}, {}},
                             b = {Color(0, 1, 0, 1), {}, {}, {}};
    {
        auto f = makeFrame(2, 2, z, {{"beauty", a}, {"specular", b}});
        ox::EdgeDilationFilter filter({"beauty", "specular"}, 1, Color::black());
        ASSERT_TRUE(filter.run(*f, nullptr));
        EXPECT_EQ(f->layerNames(), (std::vector<std::string>{"Z", "beauty", "specular"}));
        EXPECT_EQ(readColors(*f, "beauty"), std::vector<Color>(4, a[0]));
        EXPECT_EQ(readColors(*f, "specular"), std::vector<Color>(4, b[0]));
    }
    struct Case {
        const char *what;
        std::vector<std::string> layers, filterSources;
        bool withZ, aborted;
        const char *message;
    } cases[] = {
        {"missing source",
         {"beauty"},
         {"beauty", "specular"},
         true,
         false,
         "Source layer specular not found in edge dilation filter"},
        {"missing Z",
         {"beauty"},
         {"beauty"},
         false,
         false,
         "Source Z layer not found in edge dilation filter"},
        {"abort",
         {"beauty", "specular"},
         {"beauty", "specular"},
         true,
         true,
         "Edge dilation aborted"},
    };
    for (const Case &k : cases) {
        Frame f(2, 2);
        if (k.withZ) f.addTiledLayer<float>("Z")->paste(Region(0, 0, 2, 2), z.data());
        for (const std::string &l : k.layers)
            f.addTiledLayer<Color>(l)->paste(Region(0, 0, 2, 2), a.data());
        const std::vector<std::string> before = f.layerNames();
        oxtest::FakeIO io;
        io.aborted = k.aborted;
        ox::EdgeDilationFilter filter(k.filterSources, 1, Color::black());
        const std::string out =
            oxtest::captureOutput([&] { EXPECT_FALSE(filter.run(f, &io)) << k.what; });
        EXPECT_TRUE(has(out, k.message)) << k.what << ": " << out;
        EXPECT_EQ(f.layerNames(), before) << k.what;  // no result layer stays behind
        for (const std::string &l : k.layers) EXPECT_EQ(readColors(f, l), a) << k.what;
    }
}

// ---------------------------------------------------------------------------------------------
// Pixel filters

TEST(PremultiplyTest, RemovesTheBackgroundAboveTheThresholdOnly) {
    const Color bg(0.2f, 0.2f, 0.4f, 1.0f);
    struct Case {
        float t;
        Color in, out;
    } cases[] = {
        {0.0f, Color(0.5f, 0.3f, 0.3f, 0.5f), Color(0.8f, 0.4f, 0.2f, 0.5f)},
        {0.0f, Color(0.5f, 0.3f, 0.1f, 1.0f), Color(0.5f, 0.3f, 0.1f, 1.0f)},
        {0.0f, Color(0.5f, 0.3f, 0.1f, 0.0f), Color(0.5f, 0.3f, 0.1f, 0.0f)},   // a = t
        {0.6f, Color(0.5f, 0.3f, 0.1f, 0.5f), Color(0.5f, 0.3f, 0.1f, 0.5f)},   // a < t
        {-1.0f, Color(0.5f, 0.3f, 0.1f, 0.0f), Color(0.5f, 0.3f, 0.1f, 0.0f)},  // no 1 / 0
        {-1.0f, Color(0.5f, 0.3f, 0.1f, -0.5f), Color(0.5f, 0.3f, 0.1f, -0.5f)},
    };
    for (const Case &k : cases) {
        const Color got = ox::PremultiplyFilter::premultiply(k.in, k.t, bg);
        EXPECT_NEAR(got.r, k.out.r, 1e-6f);
        EXPECT_NEAR(got.g, k.out.g, 1e-6f);
        EXPECT_NEAR(got.b, k.out.b, 1e-6f);
        EXPECT_EQ(got.a, k.out.a);
    }

    // Through the command: two layers, each through its own temporary result, on one and
    // on three threads with the same bytes.
    const int w = 5, h = 37;
    std::vector<Color> a(size_t(w * h)), b(size_t(w * h));
    for (int i = 0; i < w * h; ++i) {
        a[size_t(i)] = Color(float(i % 7) * 0.1f, 0.3f, 0.2f, float(i % 5) * 0.25f);
        b[size_t(i)] = Color(0.1f, float(i % 3) * 0.2f, 0.7f, float(i % 4) * 0.3f);
    }
    std::vector<Color> first;
    for (int threads : {1, 3}) {
        auto f = makeFrame(w, h, std::vector<float>(size_t(w * h), 1.0f),
                           {{"beauty", a}, {"diffuse", b}});
        ox::PostFilterCommand cmd(std::make_unique<ox::PremultiplyFilter>(
                                      std::vector<std::string>{"beauty", "diffuse"}, 0.0f, bg),
                                  threads);
        oxtest::FakeIO io;
        ASSERT_TRUE(cmd.execute(*f, noContext(), io));
        EXPECT_EQ(f->layerNames(), (std::vector<std::string>{"Z", "beauty", "diffuse"}));
        const std::vector<Color> out = readColors(*f, "beauty");
        const std::vector<Color> outB = readColors(*f, "diffuse");
        for (int i = 0; i < w * h; ++i) {
            EXPECT_EQ(out[size_t(i)], ox::PremultiplyFilter::premultiply(a[size_t(i)], 0.0f, bg));
            EXPECT_EQ(outB[size_t(i)], ox::PremultiplyFilter::premultiply(b[size_t(i)], 0.0f, bg));
        }
        if (first.empty())
            first = out;
        else
            EXPECT_TRUE(sameBits(first, out));
        EXPECT_EQ(io.events.front(), "title Post Filtering");
        EXPECT_FALSE(io.progress.empty());
    }
}

TEST(PremultiplyTest, SingleTexelsInPlaceGoBackOnDiscard) {
    const Color bg(0.1f, 0.2f, 0.3f, 1);
    const std::vector<Color> c = {Color(1, 1, 1, 0.5f), Color(1, 1, 1, 0), Color(2, 2, 2, 0.25f)};
    for (bool keep : {false, true}) {
        auto f = makeFrame(3, 1, {1, 1, 1}, {{"beauty", c}});
        ox::PremultiplyFilter filter({"beauty"}, 0.0f, bg);
        ASSERT_TRUE(filter.init(*f, noContext()));
        for (int x = 0; x < 3; ++x) ASSERT_TRUE(filter.filterPixel(x, 0));
        if (keep) {
            ASSERT_TRUE(filter.finish(*f));
            const std::vector<Color> out = readColors(*f, "beauty");
            for (int x = 0; x < 3; ++x)
                EXPECT_EQ(out[size_t(x)], ox::PremultiplyFilter::premultiply(c[size_t(x)], 0, bg));
        } else {
            filter.discard(*f);
            EXPECT_EQ(readColors(*f, "beauty"), c);
        }
        EXPECT_EQ(f->layerNames(), (std::vector<std::string>{"Z", "beauty"}));
    }
}

TEST(PostFilterCommandTest, FailuresAndAbortLeaveTheSourcesAndNoResult) {
    const std::vector<Color> c(16, Color(0.5f, 0.5f, 0.5f, 0.5f));
    struct Case {
        const char *what;
        std::function<std::unique_ptr<ox::PostFilter>()> make;
        std::vector<std::string> extra;  // layers present besides "Z" and "beauty"
        bool abort;
        const char *message;
    } cases[] = {
        {"premultiply, missing source",
         [] {
             return std::make_unique<ox::PremultiplyFilter>(
                 std::vector<std::string>{"beauty", "nope"}, 0.0f, Color::black());
         },
         {},
         false,
         "Source layer nope not found in premultiply filter"},
        {"premultiply, result name taken",
         [] {
             return std::make_unique<ox::PremultiplyFilter>(std::vector<std::string>{"beauty"},
                                                            0.0f, Color::black());
         },
         {"temp"},
         false,
         "Layer temp already exists"},
        {"premultiply, aborted",
         [] {
             return std::make_unique<ox::PremultiplyFilter>(std::vector<std::string>{"beauty"},
                                                            0.0f, Color::black());
         },
         {},
         true,
         "Post filtering aborted"},
        {"RNM, missing source",
         [] {
             return std::make_unique<ox::RNMAverageMaxFilter>(
                 std::vector<std::string>{"beauty", "b1", "b2"},
                 std::vector<std::string>{"beauty", "max"});
         },
         {"b1"},
         false,
         "Source layer b2 not found in RNM Average/Max filter"},
        {"RNM, aborted",
         [] {
             return std::make_unique<ox::RNMAverageMaxFilter>(
                 std::vector<std::string>{"beauty", "b1", "b2"},
                 std::vector<std::string>{"beauty", "max"});
         },
         {"b1", "b2"},
         true,
         "Post filtering aborted"},
        {"range remap, missing source",
         [] { return std::make_unique<ox::RangeRemapFilter>("nope", true, true); },
         {},
         false,
         "Source layer nope not found in range remap filter"},
        {"range remap, aborted",
         [] { return std::make_unique<ox::RangeRemapFilter>("beauty", true, true); },
         {},
         true,
         "Post filtering aborted"},
    };
    for (const Case &k : cases) {
        std::vector<std::pair<std::string, std::vector<Color>>> layers = {{"beauty", c}};
        for (const std::string &e : k.extra) layers.push_back({e, c});
        auto f = makeFrame(4, 4, std::vector<float>(16, 1.0f), layers);
        const std::vector<std::string> before = f->layerNames();
        ox::PostFilterCommand cmd(k.make(), 2);
        oxtest::FakeIO io;
        io.aborted = k.abort;
        const std::string out = oxtest::captureOutput(
            [&] { EXPECT_FALSE(cmd.execute(*f, noContext(), io)) << k.what; });
        EXPECT_TRUE(has(out, k.message)) << k.what << ": " << out;
        EXPECT_EQ(f->layerNames(), before) << k.what;
        for (const auto &[name, colors] : layers) EXPECT_EQ(readColors(*f, name), colors);
    }
}

TEST(RNMAverageMaxTest, FoldsThreeBasesIntoTwoLayers) {
    struct Case {
        Color c0, c1, c2, first, second;
    } cases[] = {
        {Color(0.3f, 0.6f, 0.9f, 1.0f), Color(0.0f, 0.3f, 0.0f, 1.0f),
         Color(0.6f, 0.0f, 0.3f, 1.0f), Color(0.75f, 0.75f, 1.0f, 2.5f),
         Color(0.9f, 0.3f, 0.6f, 1.0f)},
        // All black: the average is kept as it is (no division by ~0).
        {Color(0, 0, 0, 0.3f), Color(0, 0, 0, 0.6f), Color(0, 0, 0, 0.9f), Color(0, 0, 0, 0.6f),
         Color(0, 0, 0, 0.6f)},
        // A negative largest component still divides.
        {Color(-0.3f, -0.6f, -0.9f, 0.0f), Color(-0.3f, -0.6f, -0.9f, 0.0f),
         Color(-0.3f, -0.6f, -0.9f, 0.0f), Color(1.0f, 2.0f, 3.0f, 0.0f),
         Color(-0.3f, -0.3f, -0.3f, 0.0f)},
    };
    for (const Case &k : cases) {
        Color out[2];
        ox::RNMAverageMaxFilter::fold(k.c0, k.c1, k.c2, out);
        for (int i = 0; i < 2; ++i) {
            const Color want = i == 0 ? k.first : k.second;
            EXPECT_NEAR(out[i].r, want.r, 1e-6f);
            EXPECT_NEAR(out[i].g, want.g, 1e-6f);
            EXPECT_NEAR(out[i].b, want.b, 1e-6f);
            EXPECT_NEAR(out[i].a, want.a, 1e-6f);
        }
    }

    // Through the command: the bases are removed, the pass layer and its maximum layer stay.
    const Case &k = cases[0];
    auto f = makeFrame(3, 2, std::vector<float>(6, 1.0f),
                       {{"beauty", std::vector<Color>(6, k.c0)},
                        {"beauty_rnm1", std::vector<Color>(6, k.c1)},
                        {"beauty_rnm2", std::vector<Color>(6, k.c2)}});
    ox::PostFilterCommand cmd(std::make_unique<ox::RNMAverageMaxFilter>(
        std::vector<std::string>{"beauty", "beauty_rnm1", "beauty_rnm2"},
        std::vector<std::string>{"beauty", "beauty_max"}));
    oxtest::FakeIO io;
    ASSERT_TRUE(cmd.execute(*f, noContext(), io));
    EXPECT_EQ(f->layerNames(), (std::vector<std::string>{"Z", "beauty", "beauty_max"}));
    Color out[2];
    ox::RNMAverageMaxFilter::fold(k.c0, k.c1, k.c2, out);
    EXPECT_EQ(readColors(*f, "beauty"), std::vector<Color>(6, out[0]));
    EXPECT_EQ(readColors(*f, "beauty_max"), std::vector<Color>(6, out[1]));
}

TEST(RangeRemapTest, MapsTheCoveredRangeToUnitAndLeavesEmptyRangesAlone) {
    const Color back(9.0f, -9.0f, 100.0f, 7.0f);  // background: never looked at, never changed
    const std::vector<float> z = {1, 1, 1, kBg};
    struct Case {
        const char *what;
        bool rgb, alpha;
        std::vector<Color> in, out;
        const char *message;
    } cases[] = {
        {"both",
         true,
         true,
         {Color(1, 2, 3, 0.5f), Color(5, 4, 2, 1.5f), Color(3, 3, 3, 1.0f), back},
         {Color(0, 0.25f, 0.5f, 0), Color(1, 0.75f, 0.25f, 1), Color(0.5f, 0.5f, 0.5f, 0.5f), back},
         "Found rgb range         : [1.0000 - 5.0000]"},
        {"rgb only",
         true,
         false,
         {Color(1, 2, 3, 0.5f), Color(5, 4, 2, 1.5f), Color(3, 3, 3, 1.0f), back},
         {Color(0, 0.25f, 0.5f, 0.5f), Color(1, 0.75f, 0.25f, 1.5f), Color(0.5f, 0.5f, 0.5f, 1),
          back},
         "Calculated alpha scale  : 1.000000"},
        {"all equal",
         true,
         true,
         {Color(2, 2, 2, 1), Color(2, 2, 2, 1), Color(2, 2, 2, 1), back},
         {Color(2, 2, 2, 1), Color(2, 2, 2, 1), Color(2, 2, 2, 1), back},
         "Calculated rgb scale    : 1.000000"},
        {"an infinite texel does not squash the rest",
         true,
         false,
         {Color(1, 2, 3, 1), Color(INFINITY, 2, 1, 1), Color(1, 1, 1, 1), back},
         {Color(0, 0.5f, 1, 1), Color(INFINITY, 0.5f, 0, 1), Color(0, 0, 0, 1), back},
         "Found rgb range         : [1.0000 - 3.0000]"},
    };
    for (const Case &k : cases) {
        auto f = makeFrame(2, 2, z, {{"beauty", k.in}});
        ox::PostFilterCommand cmd(std::make_unique<ox::RangeRemapFilter>("beauty", k.rgb, k.alpha));
        oxtest::FakeIO io;
        const std::string log =
            oxtest::captureOutput([&] { EXPECT_TRUE(cmd.execute(*f, noContext(), io)); });
        EXPECT_TRUE(has(log, k.message)) << k.what << ": " << log;
        EXPECT_TRUE(has(log, "Initialising range remap filter...")) << k.what;
        EXPECT_EQ(f->layerNames(), (std::vector<std::string>{"Z", "beauty"}));
        EXPECT_EQ(readColors(*f, "beauty"), k.out) << k.what;
    }
}

// ---------------------------------------------------------------------------------------------
// Shape normalization

/// Instances by column: x < split is instance 0 ("left"), the rest instance 1 ("right");
/// the texels listed in `none` have no instance.
class FakeInstances final : public ox::TexelInstanceInterface {
public:
    FakeInstances(int split, std::vector<std::pair<int, int>> none)
        : split_(split), none_(std::move(none)) {}
    void instancesOfRow(int32_t y, int32_t width, int32_t *ids) const override {
        for (int32_t x = 0; x < width; ++x) {
            ids[x] = x < split_ ? 0 : 1;
            for (const auto &[nx, ny] : none_)
                if (nx == x && ny == y) ids[x] = -1;
        }
    }
    int32_t instanceCount() const override { return 2; }
    std::string instanceName(int32_t i) const override { return i == 0 ? "left" : "right"; }

private:
    int split_;
    std::vector<std::pair<int, int>> none_;
};

class ShapeNormalizationTest : public oxtest::TempDirTest {
protected:
    ShapeNormalizationTest() : TempDirTest("ox_normalize_") {}
};

TEST_F(ShapeNormalizationTest, RangesPerShapeOrImageLinkedOrPerChannel) {
    // 4 x 2: columns 0-1 "left", 2-3 "right"; (1, 1) has no instance; (3, 1) is background.
    const std::vector<float> z = {1, 1, 1, 1, 1, 1, 1, kBg};
    const Color none(5, 5, 5, 5), back(-3, 8, 9, 2);
    const std::vector<Color> in = {Color(1, 2, 0, 1),    Color(2, 4, 0, 3),
                                   Color(4, 1, 2, 2),    Color(8, 3, 4, 4),
                                   Color(0, 1, 0, 2),    none,
                                   Color(6, 2, 1, 0.5f), back};
    FakeInstances instances(2, {{1, 1}});
    using ox::NormalizeComponent;
    using ox::NormalizeOutput;
    using ox::NormalizeRange;
    struct Case {
        const char *what;
        ox::NormalizeOptions options;
        std::vector<Color> out;
    } cases[] = {
        {"max, per channel, per shape",
         {NormalizeRange::Max, NormalizeOutput::PerChannel, NormalizeComponent::Shape, false},
         // left: max r 2, g 4, b 0 (left alone); right: max r 8, g 3, b 4.
         {Color(0.5f, 0.5f, 0, 1), Color(1, 1, 0, 3), Color(0.5f, 1 / 3.0f, 0.5f, 2),
          Color(1, 1, 1, 4), Color(0, 0.25f, 0, 2), none, Color(0.75f, 2 / 3.0f, 0.25f, 0.5f),
          back}},
        {"min-max, linked, per shape, alpha",
         {NormalizeRange::MinMax, NormalizeOutput::Linked, NormalizeComponent::Shape, true},
         // left rgb [0, 4], alpha [1, 3]; right rgb [1, 8], alpha [0.5, 4].
         {Color(0.25f, 0.5f, 0, 0), Color(0.5f, 1, 0, 1), Color(3 / 7.0f, 0, 1 / 7.0f, 1.5f / 3.5f),
          Color(1, 2 / 7.0f, 3 / 7.0f, 1), Color(0, 0.25f, 0, 0.5f), none,
          Color(5 / 7.0f, 1 / 7.0f, 0, 0), back}},
        {"max, linked, image",
         {NormalizeRange::Max, NormalizeOutput::Linked, NormalizeComponent::Image, false},
         {Color(1 / 8.0f, 2 / 8.0f, 0, 1), Color(2 / 8.0f, 4 / 8.0f, 0, 3),
          Color(4 / 8.0f, 1 / 8.0f, 2 / 8.0f, 2), Color(1, 3 / 8.0f, 4 / 8.0f, 4),
          Color(0, 1 / 8.0f, 0, 2), none, Color(6 / 8.0f, 2 / 8.0f, 1 / 8.0f, 0.5f), back}},
    };
    for (const Case &k : cases) {
        for (int threads : {1, 2}) {
            auto f = makeFrame(4, 2, z, {{"beauty", in}});
            ox::ShapeNormalizationFilter filter("beauty", k.options, &instances);
            filter.setThreadCount(threads);
            ASSERT_TRUE(filter.run(*f, nullptr)) << k.what;
            EXPECT_EQ(f->layerNames(), (std::vector<std::string>{"Z", "beauty"}));
            const std::vector<Color> out = readColors(*f, "beauty");
            for (size_t i = 0; i < out.size(); ++i) {
                EXPECT_NEAR(out[i].r, k.out[i].r, 1e-6f) << k.what << " texel " << i;
                EXPECT_NEAR(out[i].g, k.out[i].g, 1e-6f) << k.what << " texel " << i;
                EXPECT_NEAR(out[i].b, k.out[i].b, 1e-6f) << k.what << " texel " << i;
                EXPECT_NEAR(out[i].a, k.out[i].a, 1e-6f) << k.what << " texel " << i;
            }
        }
    }
}

TEST_F(ShapeNormalizationTest, RecordRoundTripAndZeroRanges) {
    // "left" is black (max 0: left as it is, recorded so); "right" has a range.
    const std::vector<float> z = {1, 1, 1, 1};
    const std::vector<Color> in = {Color(0, 0, 0, 1), Color(1, 2, 4, 1), Color(0, 0, 0, 1),
                                   Color(2, 2, 2, 1)};
    FakeInstances instances(1, {});
    auto f = makeFrame(2, 2, z, {{"beauty", in}});
    ox::ShapeNormalizationFilter filter("beauty",
                                        {ox::NormalizeRange::Max, ox::NormalizeOutput::PerChannel,
                                         ox::NormalizeComponent::Shape, true},
                                        &instances);
    filter.setRecordFile("beauty_minmax.xml");
    ASSERT_TRUE(filter.run(*f, nullptr));
    const std::vector<Color> out = readColors(*f, "beauty");
    EXPECT_EQ(out[0], in[0]);
    EXPECT_EQ(out[1], Color(0.5f, 1, 1, 1));
    EXPECT_EQ(out[3], Color(1, 1, 0.5f, 1));

    const ox::MinMaxData &rec = filter.record();
    ASSERT_EQ(rec.shapes.size(), 2u);
    EXPECT_EQ(rec.shapes[0].shape, "left");
    ASSERT_EQ(rec.shapes[0].components.size(), 4u);
    EXPECT_FALSE(rec.shapes[0].components[0].remapped);
    EXPECT_EQ(rec.shapes[0].components[0].maxVal, 0.0f);
    EXPECT_TRUE(rec.shapes[0].components[3].remapped);
    EXPECT_TRUE(rec.shapes[1].components[2].remapped);
    EXPECT_EQ(rec.shapes[1].components[2].minVal, 2.0f);
    EXPECT_EQ(rec.shapes[1].components[2].maxVal, 4.0f);
    ASSERT_EQ(rec.image.size(), 4u);
    EXPECT_FALSE(rec.image[0].remapped);  // the image range was not the one applied
    EXPECT_EQ(rec.image[1].maxVal, 2.0f);

    // The file was written under its own name only, and reads back the same record.
    std::vector<std::string> files;
    for (const auto &e : std::filesystem::directory_iterator(dir_))
        files.push_back(e.path().filename().string());
    EXPECT_EQ(files, std::vector<std::string>{"beauty_minmax.xml"});
    ox::MinMaxData back;
    ASSERT_TRUE(ox::readMinMaxData("beauty_minmax.xml", back));
    ASSERT_EQ(back.shapes.size(), rec.shapes.size());
    ASSERT_EQ(back.image.size(), rec.image.size());
    for (size_t s = 0; s < rec.shapes.size(); ++s) {
        EXPECT_EQ(back.shapes[s].shape, rec.shapes[s].shape);
        ASSERT_EQ(back.shapes[s].components.size(), rec.shapes[s].components.size());
        for (size_t c = 0; c < rec.shapes[s].components.size(); ++c) {
            EXPECT_EQ(back.shapes[s].components[c].minVal, rec.shapes[s].components[c].minVal);
            EXPECT_EQ(back.shapes[s].components[c].maxVal, rec.shapes[s].components[c].maxVal);
            EXPECT_EQ(back.shapes[s].components[c].remapped, rec.shapes[s].components[c].remapped);
        }
    }
    for (size_t c = 0; c < rec.image.size(); ++c) {
        EXPECT_EQ(back.image[c].minVal, rec.image[c].minVal);
        EXPECT_EQ(back.image[c].maxVal, rec.image[c].maxVal);
    }
    std::ifstream xml("beauty_minmax.xml");
    const std::string text((std::istreambuf_iterator<char>(xml)), std::istreambuf_iterator<char>());
    for (const char *element :
         {"<MinMaxRoot", "<imgMinMaxVec", "<minMaxVec", "<ShapeMinMax", "<shape>left</shape>",
          "<ComponentMinMaxVec", "<ComponentMinMax", "<minVal", "<maxVal"})
        EXPECT_TRUE(has(text, element)) << element;

    // Damaged or hostile record files are refused with one message and leave the record as it
    // was.
    const char *bad[] = {
        "",
        "<MinMaxRoot><imgMinMaxVec><ComponentMinMax><minVal>1",
        "<Other/>",
        "<MinMaxRoot><imgMinMaxVec><ShapeMinMax/></imgMinMaxVec></MinMaxRoot>",
        "<MinMaxRoot><imgMinMaxVec><ComponentMinMax><minVal>x</minVal></ComponentMinMax>"
        "</imgMinMaxVec></MinMaxRoot>",
        "<MinMaxRoot><imgMinMaxVec><ComponentMinMax><minVal>1e99</minVal></ComponentMinMax>"
        "</imgMinMaxVec></MinMaxRoot>",
        "<!DOCTYPE r [<!ENTITY e SYSTEM \"/etc/passwd\">]><MinMaxRoot><minMaxVec><ShapeMinMax>"
        "<shape>&e;</shape></ShapeMinMax></minMaxVec></MinMaxRoot>",
    };
    for (const char *doc : bad) {
        std::ofstream("bad.xml") << doc;
        ox::MinMaxData kept = back;
        const std::string why = oxtest::captureOutput(
            [&] { EXPECT_FALSE(ox::readMinMaxData("bad.xml", kept)) << doc; });
        EXPECT_TRUE(has(why, "MinMaxData file bad.xml")) << doc << ": " << why;
        EXPECT_EQ(kept.shapes.size(), back.shapes.size());
    }

    // A record that cannot be written fails the filter and leaves the layer as it was.
    auto g = makeFrame(2, 2, z, {{"beauty", in}});
    filter.setRecordFile("no/such/dir/beauty_minmax.xml");
    const std::string log = oxtest::captureOutput([&] { EXPECT_FALSE(filter.run(*g, nullptr)); });
    EXPECT_FALSE(log.empty());
    EXPECT_EQ(g->layerNames(), (std::vector<std::string>{"Z", "beauty"}));
    EXPECT_EQ(readColors(*g, "beauty"), in);
    EXPECT_TRUE(has(oxtest::captureOutput([&] {
                        EXPECT_FALSE(ox::readMinMaxData("no/such/dir/beauty_minmax.xml", back));
                    }),
                    "Could not open MinMaxData file"));
}

TEST_F(ShapeNormalizationTest, TexelsWithoutInstanceAreLoggedAndMissingInputsFail) {
    ox::setTypeEnabled(ox::kMsgDebug, true);
    FakeInstances instances(1, {{1, 0}});
    auto f = makeFrame(2, 1, {1, 1}, {{"beauty", {Color(1, 1, 1, 1), Color(3, 3, 3, 1)}}});
    ox::ShapeNormalizationFilter filter("beauty", {}, &instances);
    std::string log = oxtest::captureOutput([&] { EXPECT_TRUE(filter.run(*f, nullptr)); });
    EXPECT_TRUE(has(log, "No instance found in sampled pixel 1, 0")) << log;
    EXPECT_EQ(readColors(*f, "beauty")[1], Color(3, 3, 3, 1));

    ox::ShapeNormalizationFilter missing("diffuse", {}, &instances);
    log = oxtest::captureOutput([&] { EXPECT_FALSE(missing.run(*f, nullptr)); });
    EXPECT_TRUE(has(log, "Source layer diffuse not found in shape normalization filter"));
    ox::ShapeNormalizationFilter noLookup("beauty", {}, nullptr);
    log = oxtest::captureOutput([&] { EXPECT_FALSE(noLookup.run(*f, nullptr)); });
    EXPECT_FALSE(log.empty());
    oxtest::FakeIO io;
    io.aborted = true;
    log = oxtest::captureOutput([&] { EXPECT_FALSE(filter.run(*f, &io)); });
    EXPECT_TRUE(has(log, "Shape normalization aborted"));
    EXPECT_EQ(f->layerNames(), (std::vector<std::string>{"Z", "beauty"}));
}

TEST_F(ShapeNormalizationTest, ManyInstancesGiveWhatFewGive) {
    // More instances than a 16-bit slot table holds: the texels of instances 0 and 69999 must
    // come out as those of instances 0 and 1 of a two-instance frame.
    class Spread final : public ox::TexelInstanceInterface {
    public:
        void instancesOfRow(int32_t y, int32_t width, int32_t *ids) const override {
            split_.instancesOfRow(y, width, ids);
            for (int32_t x = 0; x < width; ++x)
                if (ids[x] == 1) ids[x] = 69999;
        }
        int32_t instanceCount() const override { return 70000; }
        std::string instanceName(int32_t i) const override { return std::to_string(i); }

    private:
        FakeInstances split_{3, {{4, 1}}};
    };
    const std::vector<float> z = {1, 1, 1, 1, kBg, 1, 1, 1, 1, 1, 1, 1};
    std::vector<Color> in(12);
    for (size_t i = 0; i < in.size(); ++i) in[i] = Color(float(i), float(i % 5), 2, float(i % 3));
    const ox::NormalizeOptions options{ox::NormalizeRange::MinMax, ox::NormalizeOutput::PerChannel,
                                       ox::NormalizeComponent::Shape, true};
    FakeInstances few(3, {{4, 1}});
    Spread many;
    std::vector<Color> results[2];
    const ox::TexelInstanceInterface *lookups[2] = {&few, &many};
    for (int k = 0; k < 2; ++k) {
        auto f = makeFrame(6, 2, z, {{"beauty", in}});
        ox::ShapeNormalizationFilter filter("beauty", options, lookups[k]);
        filter.setThreadCount(2);
        ASSERT_TRUE(filter.run(*f, nullptr));
        results[k] = readColors(*f, "beauty");
        ASSERT_EQ(filter.record().shapes.size(), 2u);
    }
    EXPECT_TRUE(sameBits(results[0], results[1]));
    EXPECT_EQ(results[0][4], in[4]);    // background
    EXPECT_EQ(results[0][10], in[10]);  // (4, 1) has no instance
    EXPECT_NE(results[0][1], in[1]);
}

TEST_F(ShapeNormalizationTest, ChainGivesTheSameBytesWhateverTilesAndThreads) {
    // Premultiply, dilation and normalization over blobs on a frame of several partial tiles:
    // layers worked in place (default tiles) or through band copies (small tiles), on one to
    // three threads, must all give the same bytes.
    const int w = 150, h = 90;
    std::mt19937 rng(99);
    std::uniform_real_distribution<float> u(0.0f, 1.0f);
    std::vector<float> z(size_t(w * h), kBg);
    std::vector<Color> c(size_t(w * h));
    for (int blob = 0; blob < 12; ++blob) {
        const float cx = u(rng) * w, cy = u(rng) * h, r = 3 + u(rng) * 12;
        for (int y = 0; y < h; ++y)
            for (int x = 0; x < w; ++x)
                if ((x - cx) * (x - cx) + (y - cy) * (y - cy) <= r * r) z[size_t(y * w + x)] = 1;
    }
    for (Color &t : c) t = Color(u(rng) * 3, u(rng) * 2, u(rng), u(rng));
    FakeInstances instances(70, {{75, 40}, {10, 10}});
    const ox::NormalizeOptions options{ox::NormalizeRange::MinMax, ox::NormalizeOutput::PerChannel,
                                       ox::NormalizeComponent::Shape, true};
    std::vector<Color> first;
    for (int tile : {ox::kLayerTileSize, 8})
        for (int threads : {1, 2, 3}) {
            auto f = makeFrame(w, h, z, {{"beauty", c}}, tile);
            ox::PostFilterCommand premultiply(
                std::make_unique<ox::PremultiplyFilter>(std::vector<std::string>{"beauty"}, 0.0f,
                                                        Color(0.1f, 0.2f, 0.3f, 1)),
                threads);
            ox::EdgeDilationFilter dilation({"beauty"}, 4, Color(0, 0, 0, 1));
            dilation.setThreadCount(threads);
            ox::ShapeNormalizationFilter normalization("beauty", options, &instances);
            normalization.setThreadCount(threads);
            oxtest::FakeIO io;
            ASSERT_TRUE(premultiply.execute(*f, noContext(), io));
            ASSERT_TRUE(dilation.run(*f, &io));
            ASSERT_TRUE(normalization.run(*f, &io));
            EXPECT_EQ(f->layerNames(), (std::vector<std::string>{"Z", "beauty"}));
            const std::vector<Color> out = readColors(*f, "beauty");
            if (first.empty()) {
                first = out;
                // Covered texels with an instance end up in [0, 1].
                for (size_t i = 0; i < out.size(); ++i) {
                    if (z[i] < 0 || i == size_t(40 * w + 75) || i == size_t(10 * w + 10)) continue;
                    EXPECT_TRUE(out[i].r >= 0 && out[i].r <= 1 && out[i].a >= 0 && out[i].a <= 1)
                        << i;
                }
            } else {
                EXPECT_TRUE(sameBits(out, first)) << "tile " << tile << " threads " << threads;
            }
        }
}

TEST_F(ShapeNormalizationTest, RewritesInPlaceOrThroughResultsAndAbortsPutEverythingBack) {
    // Premultiply and normalization rewrite the texels they change in the source's tiles,
    // unless an observer watches the source: both ways give the same bytes. An abort after the
    // first bands (on one and on two threads) leaves the source exactly as it was.
    struct Quiet final : ox::LayerObserver {
        std::string observedLayer() const override { return "beauty"; }
        void notify(const Region &, const Color *, int64_t, const std::string &) override {}
    };
    const int w = 70, h = 300;  // several bands of rows, partial tiles at the right
    std::mt19937 rng(5);
    std::uniform_real_distribution<float> u(0.0f, 1.0f);
    std::vector<float> z(size_t(w * h));
    std::vector<Color> c(size_t(w * h));
    for (size_t i = 0; i < z.size(); ++i) {
        z[i] = u(rng) < 0.4f ? 1.0f : kBg;
        // Alpha 0, 1, negative, NaN or in between: only some texels change.
        const float pick = u(rng);
        const float a = pick < 0.2f    ? 0.0f
                        : pick < 0.3f  ? 1.0f
                        : pick < 0.35f ? -0.5f
                        : pick < 0.4f  ? std::numeric_limits<float>::quiet_NaN()
                                       : u(rng);
        c[i] = Color(u(rng) * 4, u(rng), u(rng) * 2, a);
    }
    FakeInstances instances(30, {{3, 250}});
    const ox::NormalizeOptions options{ox::NormalizeRange::MinMax, ox::NormalizeOutput::PerChannel,
                                       ox::NormalizeComponent::Shape, false};
    auto premultiply = [&](int threads) {
        return ox::PostFilterCommand(
            std::make_unique<ox::PremultiplyFilter>(std::vector<std::string>{"beauty"}, 0.25f,
                                                    Color(0.1f, 0.2f, 0.3f, 1)),
            threads);
    };
    std::vector<Color> want[2];
    for (bool observed : {false, true}) {
        auto f = makeFrame(w, h, z, {{"beauty", c}});
        Quiet quiet;
        if (observed) {
            ASSERT_TRUE(f->registerObserver("beauty", &quiet));
        }
        oxtest::FakeIO io;
        ASSERT_TRUE(premultiply(2).execute(*f, noContext(), io));
        if (observed) {
            EXPECT_TRUE(sameBits(readColors(*f, "beauty"), want[0]));
            // The placed result is a new layer: it is watched again.
            ASSERT_TRUE(f->registerObserver("beauty", &quiet));
        } else {
            want[0] = readColors(*f, "beauty");
        }
        ox::ShapeNormalizationFilter normalization("beauty", options, &instances);
        normalization.setThreadCount(2);
        ASSERT_TRUE(normalization.run(*f, &io));
        if (!observed) {
            for (size_t i = 0; i < c.size(); ++i)
                ASSERT_TRUE(
                    std::memcmp(&want[0][i], &c[i], sizeof(Color)) == 0 ||
                    (c[i].a > 0.25f && want[0][i] == ox::PremultiplyFilter::premultiply(
                                                         c[i], 0.25f, Color(0.1f, 0.2f, 0.3f, 1))))
                    << i;
            want[1] = readColors(*f, "beauty");
            continue;
        }
        EXPECT_TRUE(sameBits(readColors(*f, "beauty"), want[1]));
        EXPECT_EQ(f->layerNames(), (std::vector<std::string>{"Z", "beauty"}));
    }

    for (int threads : {1, 2}) {
        auto f = makeFrame(w, h, z, {{"beauty", c}});
        oxtest::FakeIO io;
        // Aborted at the third check: after two bands, however the threads are scheduled.
        io.abortAtCheck = 3;
        const std::string log = oxtest::captureOutput(
            [&] { EXPECT_FALSE(premultiply(threads).execute(*f, noContext(), io)); });
        EXPECT_TRUE(has(log, "Post filtering aborted")) << log;
        EXPECT_TRUE(sameBits(readColors(*f, "beauty"), c)) << threads;

        ox::ShapeNormalizationFilter normalization("beauty", options, &instances);
        normalization.setThreadCount(threads);
        oxtest::FakeIO later;
        later.abortAtCheck = 3;
        EXPECT_TRUE(has(oxtest::captureOutput([&] { EXPECT_FALSE(normalization.run(*f, &later)); }),
                        "Shape normalization aborted"));
        EXPECT_TRUE(sameBits(readColors(*f, "beauty"), c)) << threads;
        EXPECT_EQ(f->layerNames(), (std::vector<std::string>{"Z", "beauty"}));
    }
}

// ---------------------------------------------------------------------------------------------
// Output shader command and colour corrections

TEST(OutputShaderCommandTest, RunsTheShadersOnTheTargetOrFails) {
    struct Doubler final : ox::OutputShaderInterface {
        bool shade(ox::LayerT<Color> &layer, ox::RenderIOInterface &) override {
            Color c;
            layer.read(Region(0, 0, 1, 1), &c);
            c *= 2.0f;
            return layer.paste(Region(0, 0, 1, 1), &c);
        }
    } doubler;
    auto f = makeFrame(1, 1, {1}, {{"beauty", {Color(1, 2, 3, 4)}}});
    oxtest::FakeIO io;
    ox::OutputShaderCommand ok("beauty", {&doubler, &doubler});
    EXPECT_TRUE(ok.execute(*f, noContext(), io));
    EXPECT_EQ(readColors(*f, "beauty")[0], Color(4, 8, 12, 16));
    ox::OutputShaderCommand bad("diffuse", {&doubler});
    const std::string log =
        oxtest::captureOutput([&] { EXPECT_FALSE(bad.execute(*f, noContext(), io)); });
    EXPECT_TRUE(has(log, "OutputShaderCommand failed: target layer diffuse not defined"));
}

TEST(ColorCorrectionTest, SRGBAndGammaIncludingNegativeAndNaN) {
    const float nan = std::numeric_limits<float>::quiet_NaN();
    struct Case {
        float in, srgb, gamma2;
    } cases[] = {
        {0.0031308f, 0.04044994f, 0.05595355f},
        {1.0f, 1.0f, 1.0f},
        {0.25f, 0.5370987f, 0.5f},
        {0.001f, 0.01292f, 0.0316228f},
        {0.0f, 0.0f, 0.0f},
        {-0.5f, 0.0f, 0.0f},
        {nan, 0.0f, 0.0f},
        {-INFINITY, 0.0f, 0.0f},
    };
    ox::OXCComplexTypeInstantiator<ox::OutputCorrectionBase> settings;
    settings.colorCorrection = ox::ColorCorrection::SRGB;
    auto srgb = ox::createColorCorrection(settings);
    settings.colorCorrection = ox::ColorCorrection::Gamma;
    settings.gamma = 2.0f;
    auto gamma = ox::createColorCorrection(settings);
    settings.colorCorrection = ox::ColorCorrection::None;
    auto none = ox::createColorCorrection(settings);
    for (const Case &k : cases) {
        const std::vector<Color> in = {Color(k.in, k.in, k.in, -0.5f)};
        std::vector<Color> s, g, n;
        srgb->correct(in, s);
        gamma->correct(in, g);
        none->correct(in, n);
        EXPECT_NEAR(s[0].r, k.srgb, 1e-6f) << k.in;
        EXPECT_NEAR(s[0].b, k.srgb, 1e-6f) << k.in;
        EXPECT_NEAR(g[0].g, k.gamma2, 1e-6f) << k.in;
        EXPECT_EQ(s[0].a, -0.5f);  // alpha is never corrected
        EXPECT_EQ(g[0].a, -0.5f);
        EXPECT_TRUE(std::memcmp(&n[0], &in[0], sizeof(Color)) == 0);
    }
}

}  // namespace
