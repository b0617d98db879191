#include <gtest/gtest.h>

#include <array>
#include <filesystem>
#include <functional>

#include "tests/support/test_support.h"
#include "tests/texture/image_files.h"
#include "texture/image_reader.h"

namespace {

using oxtest::Bytes;
using oxtest::Picture;
using testing::internal::CaptureStdout;
using testing::internal::GetCapturedStdout;

/// Decodes bytes with the reader of an extension; messages are swallowed.
bool decode(const std::string &ext, const Bytes &b, ox::TexelBuffer &out,
            const ox::ReaderOptions &options = {}) {
    static const ox::ReaderRegistry registry;
    CaptureStdout();
    const bool ok =
        ox::decodeImage(registry, ext, "test." + ext, b.data(), b.size(), options, {}, out);
    GetCapturedStdout();
    return ok;
}

/// Every texel of the buffer against the expectation at (x, row from the top).
void expectTexels(const ox::TexelBuffer &b, int w, int h,
                  const std::function<ox::Color(int, int)> &expected, float tolerance,
                  const std::string &what) {
    ASSERT_EQ(b.width(), w) << what;
    ASSERT_EQ(b.height(), h) << what;
    int bad = 0;
    for (int y = 0; y < h && bad < 5; ++y)
        for (int x = 0; x < w && bad < 5; ++x) {
            const ox::Color got = b.texel(x, h - 1 - y), want = expected(x, y);
            const float d =
                std::max(std::max(std::fabs(got.r - want.r), std::fabs(got.g - want.g)),
                         std::max(std::fabs(got.b - want.b), std::fabs(got.a - want.a)));
            if (d > tolerance + 1e-6f) {
                ++bad;
                ADD_FAILURE() << what << " texel " << x << "," << y << " from the top: got "
                              << got.r << " " << got.g << " " << got.b << " " << got.a << ", want "
                              << want.r << " " << want.g << " " << want.b << " " << want.a;
            }
        }
}

ox::Color rgba8(const uint8_t *t, bool alpha = true) {
    return {t[0] / 255.0f, t[1] / 255.0f, t[2] / 255.0f, alpha ? t[3] / 255.0f : 1.0f};
}

/// A picture with runs for the run-length encoders: its middle row is one colour.
Picture runPicture(int w, int h) {
    Picture p = oxtest::testPicture(w, h);
    for (int x = 0; x < w; ++x) std::memcpy(p.at(x, h / 2), p.at(0, h / 2), 4);
    return p;
}

TEST(ImageReaders, TGAInEveryLayoutAndOrder) {
    const Picture p = runPicture(7, 5);
    for (bool rle : {false, true})
        for (bool grey : {false, true})
            for (bool alpha : {false, true})
                for (bool topDown : {false, true}) {
                    if (grey && alpha) continue;
                    const bool footer = rle != topDown;
                    const std::string what = std::string("tga rle=") + (rle ? "1" : "0") +
                                             " grey=" + (grey ? "1" : "0") +
                                             " alpha=" + (alpha ? "1" : "0") +
                                             " top=" + (topDown ? "1" : "0");
                    ox::TexelBuffer b;
                    ASSERT_TRUE(
                        decode("tga", oxtest::makeTGA(p, rle, grey, alpha, topDown, footer), b))
                        << what;
                    EXPECT_EQ(int(b.format().channels), grey ? 1 : alpha ? 4 : 3) << what;
                    expectTexels(
                        b, 7, 5,
                        [&](int x, int y) {
                            const uint8_t *t = p.at(x, y);
                            if (grey)
                                return ox::Color(t[0] / 255.0f, t[0] / 255.0f, t[0] / 255.0f, 1);
                            return rgba8(t, alpha);
                        },
                        0.0f, what);
                }
}

TEST(ImageReaders, BMPBottomUpAndTopDown) {
    const Picture p = oxtest::testPicture(5, 3);  // 15 bytes a row: padded to 16
    for (int bits : {24, 32})
        for (bool topDown : {false, true}) {
            ox::TexelBuffer b;
            ASSERT_TRUE(decode("bmp", oxtest::makeBMP(p, bits, topDown), b));
            expectTexels(
                b, 5, 3, [&](int x, int y) { return rgba8(p.at(x, y), bits == 32); }, 0.0f,
                "bmp " + std::to_string(bits) + (topDown ? " top-down" : ""));
        }
}

TEST(ImageReaders, RadianceFlatAndRunLengthInBothOrders) {
    const int w = 12, h = 3;
    std::vector<std::array<uint8_t, 4>> texels(size_t(w * h));
    for (int i = 0; i < w * h; ++i) {
        // Equal neighbours make runs; the exponents span dark to bright.
        const float v = float(1 << (i % 5)) * (i < w ? 1.0f : 0.01f * float(i));
        oxtest::rgbe(v, v * 0.5f, (i / 4) * 0.25f, texels[size_t(i)].data());
    }
    for (bool rle : {false, true})
        for (bool topDown : {true, false}) {
            ox::TexelBuffer b;
            ASSERT_TRUE(decode("hdr", oxtest::makeHDR(w, h, texels, rle, topDown), b));
            EXPECT_EQ(b.format().type, ox::TexelType::kF32);
            expectTexels(
                b, w, h,
                [&](int x, int y) {
                    const auto &t = texels[size_t(y * w + x)];
                    const float f = t[3] ? std::ldexp(1.0f, t[3] - 136) : 0.0f;
                    return ox::Color((t[0] + 0.5f) * f * (t[3] != 0),
                                     (t[1] + 0.5f) * f * (t[3] != 0),
                                     (t[2] + 0.5f) * f * (t[3] != 0), 1.0f);
                },
                1e-6f, std::string("hdr") + (rle ? " rle" : "") + (topDown ? " -Y" : " +Y"));
        }
}

TEST(ImageReaders, DDSBlocksWithOneBitAndInterpolatedAlpha) {
    // DXT1 in three-colour mode (c0 <= c1): index 3 is transparent black. Two blocks side by side,
    // the picture's top row first within each block.
    Bytes dxt1;
    for (uint16_t c0 : {0x001f, 0xf800}) {  // blue, red
        oxtest::put16(dxt1, c0);
        oxtest::put16(dxt1, 0xffff);       // white
        oxtest::put32(dxt1, 0xE4E4E4E4u);  // each row: indices 0, 1, 2, 3
    }
    ox::TexelBuffer b;
    ASSERT_TRUE(decode("dds", oxtest::makeDDS(8, 4, "DXT1", dxt1), b));
    expectTexels(
        b, 8, 4,
        [](int x, int) {
            const bool red = x >= 4;
            switch (x & 3) {
                case 0:
                    return red ? ox::Color(1, 0, 0, 1) : ox::Color(0, 0, 1, 1);
                case 1:
                    return ox::Color(1, 1, 1, 1);
                case 2:
                    return red ? ox::Color(1, 127 / 255.f, 127 / 255.f, 1)
                               : ox::Color(127 / 255.f, 127 / 255.f, 1, 1);
                default:
                    return ox::Color(0, 0, 0, 0);
            }
        },
        0.0f, "dxt1");

    // DXT5: alpha 255 and 0 (eight-step mode); row k uses alpha index k (0 = 255, 1 = 0,
    // 2 = 219, 3 = 182), colour index 0 (green).
    Bytes dxt5{255, 0};
    uint64_t abits = 0;
    for (int i = 0; i < 16; ++i) abits |= uint64_t(i / 4) << (3 * i);
    for (int i = 0; i < 6; ++i) dxt5.push_back(uint8_t(abits >> (8 * i)));
    oxtest::put16(dxt5, 0x07e0), oxtest::put16(dxt5, 0), oxtest::put32(dxt5, 0);
    ASSERT_TRUE(decode("dds", oxtest::makeDDS(3, 3, "DXT5", dxt5), b));  // a partial block
    const float alphas[4] = {1.0f, 0.0f, 219 / 255.f, 182 / 255.f};
    expectTexels(
        b, 3, 3, [&](int, int y) { return ox::Color(0, 1, 0, alphas[y]); }, 0.0f, "dxt5");
}

TEST(ImageReaders, PNGDepthsPalettesAndAlpha) {
    const Picture p = oxtest::testPicture(6, 4);
    struct Case {
        int type, depth, channels;
        ox::TexelType texel;
    };
    for (const Case c : {Case{PNG_COLOR_TYPE_RGBA, 8, 4, ox::TexelType::kU8},
                         Case{PNG_COLOR_TYPE_RGB, 16, 3, ox::TexelType::kU16},
                         Case{PNG_COLOR_TYPE_RGBA, 16, 4, ox::TexelType::kU16},
                         Case{PNG_COLOR_TYPE_GRAY_ALPHA, 8, 2, ox::TexelType::kU8},
                         Case{PNG_COLOR_TYPE_GRAY, 16, 1, ox::TexelType::kU16},
                         Case{PNG_COLOR_TYPE_PALETTE, 8, 4, ox::TexelType::kU8}}) {
        const std::string what =
            "png type " + std::to_string(c.type) + " depth " + std::to_string(c.depth);
        ox::TexelBuffer b;
        ASSERT_TRUE(decode("png", oxtest::makePNG(p, c.type, c.depth), b)) << what;
        EXPECT_EQ(int(b.format().channels), c.channels) << what;
        EXPECT_EQ(b.format().type, c.texel) << what;
        expectTexels(
            b, 6, 4,
            [&](int x, int y) {
                const uint8_t *t = p.at(x, y);
                auto s = [&](uint8_t v) {
                    return c.depth == 16 ? std::min(v * 257 + x, 65535) / 65535.0f : v / 255.0f;
                };
                switch (c.channels) {
                    case 1:
                        return ox::Color(s(t[0]), s(t[0]), s(t[0]), 1);
                    case 2:
                        return ox::Color(s(t[0]), s(t[0]), s(t[0]), s(t[3]));
                    case 3:
                        return ox::Color(s(t[0]), s(t[1]), s(t[2]), 1);
                    default:
                        if (c.type == PNG_COLOR_TYPE_PALETTE)  // entry i = (i, 255 - i, 7), alpha i
                            return ox::Color(t[0] / 255.f, (255 - t[0]) / 255.f, 7 / 255.f,
                                             t[0] / 255.f);
                        return ox::Color(s(t[0]), s(t[1]), s(t[2]), s(t[3]));
                }
            },
            0.0f, what);
    }
}

TEST(ImageReaders, JPEGColourAndGrey) {
    // A smooth picture keeps quality-100 JPEG within a few steps.
    Picture p{16, 8, std::vector<uint8_t>(16 * 8 * 4)};
    for (int y = 0; y < 8; ++y)
        for (int x = 0; x < 16; ++x) {
            uint8_t *t = p.at(x, y);
            t[0] = uint8_t(40 + 8 * x), t[1] = uint8_t(200 - 10 * y), t[2] = 90, t[3] = 255;
        }
    for (bool grey : {false, true}) {
        ox::TexelBuffer b;
        ASSERT_TRUE(decode("jpg", oxtest::makeJPEG(p, grey), b));
        EXPECT_EQ(int(b.format().channels), grey ? 1 : 3);
        expectTexels(
            b, 16, 8,
            [&](int x, int y) {
                const uint8_t *t = p.at(x, y);
                return grey ? ox::Color(t[0] / 255.f, t[0] / 255.f, t[0] / 255.f, 1)
                            : rgba8(t, false);
            },
            4.0f / 255.0f, grey ? "grey jpeg" : "jpeg");
    }
}

class FileReaders : public oxtest::TempDirTest {
protected:
    FileReaders() : TempDirTest("ox_texture_readers_") {}
};

TEST_F(FileReaders, TIFFFloatIntegerStripsAndTiles) {
    ox::TexelBuffer b;
    auto f = [](int x, int y, int c) {
        return float(x) * 0.25f - float(y) * 3.5f + float(c) * 100.0f;
    };
    ASSERT_TRUE(oxtest::writeTIFF<float>("f.tif", 5, 3, 3, SAMPLEFORMAT_IEEEFP, false, f));
    ASSERT_TRUE(decode("tif", oxtest::readBytes("f.tif"), b));
    EXPECT_EQ(b.format().type, ox::TexelType::kF32);
    expectTexels(
        b, 5, 3, [&](int x, int y) { return ox::Color(f(x, y, 0), f(x, y, 1), f(x, y, 2), 1); },
        0.0f, "float tiff");

    auto g = [](int x, int y, int c) { return uint16_t(c ? 65535 - x * 1000 : x * 1000 + y * 7); };
    ASSERT_TRUE(oxtest::writeTIFF<uint16_t>("g.tif", 20, 18, 2, SAMPLEFORMAT_UINT, true, g));
    ASSERT_TRUE(decode("tiff", oxtest::readBytes("g.tif"), b));
    EXPECT_EQ(b.format().type, ox::TexelType::kU16);
    expectTexels(
        b, 20, 18,
        [&](int x, int y) {
            const float v = g(x, y, 0) / 65535.0f;
            return ox::Color(v, v, v, g(x, y, 1) / 65535.0f);
        },
        0.0f, "tiled 16-bit grey + alpha tiff");

    auto h = [](int x, int y, int c) { return uint8_t(x * 30 + y * 5 + c); };
    ASSERT_TRUE(oxtest::writeTIFF<uint8_t>("h.tif", 4, 4, 4, SAMPLEFORMAT_UINT, false, h));
    ASSERT_TRUE(decode("tif", oxtest::readBytes("h.tif"), b));
    expectTexels(
        b, 4, 4,
        [&](int x, int y) {
            return ox::Color(h(x, y, 0) / 255.f, h(x, y, 1) / 255.f, h(x, y, 2) / 255.f,
                             h(x, y, 3) / 255.f);
        },
        0.0f, "8-bit rgba tiff");
}

TEST_F(FileReaders, EXRScanlineTiledHalfFloatAndLayers) {
    const int w = 40, h = 36;
    auto val = [](int x, int y, int c) { return float(x) * 0.5f + float(y) * 0.125f + float(c); };
    oxtest::writeEXR("half.exr", w, h, {"R", "G", "B", "A"}, Imf::HALF, 0, val);
    ox::TexelBuffer b;
    ASSERT_TRUE(decode("exr", oxtest::readBytes("half.exr"), b));
    EXPECT_EQ(b.format().type, ox::TexelType::kF16);
    expectTexels(
        b, w, h,
        [&](int x, int y) {
            return ox::Color(float(Imath::half(val(x, y, 0))), float(Imath::half(val(x, y, 1))),
                             float(Imath::half(val(x, y, 2))), float(Imath::half(val(x, y, 3))));
        },
        0.0f, "half exr");

    // A tiled multi-layer file as the system writes it: layer "beauty" in float, 32 x 32 tiles,
    // the active-tiles attribute marking the bottom-left tile of the picture inactive.
    auto writeLayered = [&](const char *path, const char *activeTiles) {
        oxtest::writeEXR(
            path, w, h, {"beauty.R", "beauty.G", "beauty.B", "Z"}, Imf::FLOAT, 32,
            [&](int x, int y, int c) { return c < 3 ? val(x, y, c) : 0.0f; }, activeTiles);
    };
    writeLayered("layers.exr", "0111");
    ox::ReaderOptions beauty;
    beauty.layer = "beauty";
    ASSERT_TRUE(decode("exr", oxtest::readBytes("layers.exr"), b, beauty));
    EXPECT_EQ(b.format().type, ox::TexelType::kF32);
    EXPECT_EQ(int(b.format().channels), 3);
    // The inactive cell covers picture rows 0-31 from the bottom (4-35 from the top) in columns
    // 0-31. The file's tile of rows 0-31 from the top also reaches into an active cell and is
    // read; its tile of rows 32-35 lies inside the inactive cell alone and stays empty.
    expectTexels(
        b, w, h,
        [&](int x, int y) {
            if (x < 32 && y >= 32) return ox::Color(0, 0, 0, 1);
            return ox::Color(val(x, y, 0), val(x, y, 1), val(x, y, 2), 1);
        },
        0.0f, "layer with active tiles");

    // Without the attribute every tile is read (with a warning); a missing layer fails.
    writeLayered("plain.exr", nullptr);
    CaptureStdout();
    ox::ReaderRegistry registry;
    const Bytes plain = oxtest::readBytes("plain.exr");
    EXPECT_TRUE(
        ox::decodeImage(registry, "exr", "plain.exr", plain.data(), plain.size(), beauty, {}, b));
    ox::ReaderOptions diffuse;
    diffuse.layer = "diffuse";
    EXPECT_FALSE(
        ox::decodeImage(registry, "exr", "plain.exr", plain.data(), plain.size(), diffuse, {}, b));
    const std::string out = GetCapturedStdout();
    EXPECT_NE(out.find("No OpenEXR meta-data in file plain.exr, required for optimized reading"),
              std::string::npos);
    EXPECT_NE(out.find("Error reading layer in EXRFile: plain.exr"), std::string::npos);
    expectTexels(
        b, w, h,
        [&](int x, int y) { return ox::Color(val(x, y, 0), val(x, y, 1), val(x, y, 2), 1); }, 0.0f,
        "layer without active tiles");
}

TEST_F(FileReaders, IndependentToolsAgree) {
    // A gradient made by ImageMagick as a binary PPM (top row first, no orientation question),
    // then written in every format by OpenImageIO, when both tools are installed.
    if (std::system("command -v convert >/dev/null 2>&1") != 0 ||
        std::system("command -v oiiotool >/dev/null 2>&1") != 0)
        GTEST_SKIP() << "no convert or oiiotool";
    ASSERT_EQ(std::system("convert -size 9x7 gradient:red-blue -depth 8 ref.ppm >/dev/null 2>&1"),
              0);
    const Bytes ppm = oxtest::readBytes("ref.ppm");
    ASSERT_GT(ppm.size(), 9u * 7 * 3);
    const uint8_t *ref = ppm.data() + ppm.size() - 9 * 7 * 3;
    for (const char *ext : {"tga", "bmp", "png", "tif"}) {
        const std::string file = std::string("ref.") + ext;
        ASSERT_EQ(std::system(("oiiotool ref.ppm -o " + file + " >/dev/null 2>&1").c_str()), 0);
        ox::TexelBuffer b;
        ASSERT_TRUE(decode(ext, oxtest::readBytes(file), b)) << ext;
        expectTexels(
            b, 9, 7,
            [&](int x, int y) {
                const uint8_t *t = ref + (y * 9 + x) * 3;
                return ox::Color(t[0] / 255.f, t[1] / 255.f, t[2] / 255.f, 1);
            },
            0.0f, file);
    }
}

TEST(ImageReaders, ExtensionsRegistryAndMessages) {
    EXPECT_EQ(ox::textureExtension("maps/Brick.PNG"), "png");
    EXPECT_EQ(ox::textureExtension("a.b.tga"), "tga");
    ox::ReaderRegistry r;
    for (const char *e :
         {"tga", "jpeg", "jpg", "tif", "tiff", "hdr", "png", "exr", "bmp", "dds", "TGA"})
        EXPECT_NE(r.find(e), nullptr) << e;
    EXPECT_EQ(r.find("vendrel"), nullptr);
    CaptureStdout();
    EXPECT_FALSE(r.registerReader("PNG", ox::makePNGFactory()));
    ox::TexelBuffer b;
    EXPECT_FALSE(ox::decodeImage(r, "gif", "x.gif", nullptr, 0, {}, {}, b));
    const std::string out = GetCapturedStdout();
    EXPECT_NE(out.find("Image reader for extension png already registered"), std::string::npos);
    EXPECT_NE(out.find("No image reader for extension gif registered"), std::string::npos);
}

}  // namespace
