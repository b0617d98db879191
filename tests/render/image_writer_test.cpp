#include "render/image_writer.h"

#include <ImfChannelList.h>
#include <ImfFrameBuffer.h>
#include <ImfHeader.h>
#include <ImfInputFile.h>
#include <ImfStringAttribute.h>
#include <ImfTiledInputFile.h>
#include <gtest/gtest.h>
#include <jpeglib.h>
#include <signal.h>
#include <sys/resource.h>

#include <cmath>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <functional>
#include <map>
#include <string>
#include <vector>

#include "tests/support/test_support.h"

namespace fs = std::filesystem;

namespace {

using ox::Color;
using ox::Region;

using oxtest::contains;
using oxtest::readFile;

/// The test picture: every value tells its pixel and layer.
Color beautyAt(int x, int y) { return Color(x * 0.01f, y * 0.02f, 0.25f + x * y * 1e-4f, 0.5f); }
float zAt(int x, int y) { return x < 40 ? float(x + y) : -1.0f; }

/// A frame with a colour, a float "Z", a boolean and a six-channel custom-float layer.
std::unique_ptr<ox::Frame> testFrame(int w, int h) {
    auto frame = std::make_unique<ox::Frame>(w, h);
    auto *beauty = frame->addTiledLayer<Color>("beauty");
    auto *z = frame->addTiledLayer<float>("Z");
    auto *mask = frame->addTiledLayer<bool>("mask");
    auto *irr = frame->addCustomFloatLayer("irr", 6);
    std::vector<Color> c(size_t(w) * h);
    std::vector<float> f(size_t(w) * h), cf(size_t(w) * h * 6);
    std::unique_ptr<bool[]> m(new bool[size_t(w) * h]);
    for (int y = 0; y < h; ++y)
        for (int x = 0; x < w; ++x) {
            const size_t i = size_t(y) * w + x;
            c[i] = beautyAt(x, y);
            f[i] = zAt(x, y);
            m[i] = (x + y) % 3 == 0;
            for (int k = 0; k < 6; ++k) cf[i * 6 + k] = float(k * 1000 + x + y * 0.5);
        }
    const Region all(0, 0, w, h);
    EXPECT_TRUE(beauty->paste(all, c.data()) && z->paste(all, f.data()) &&
                mask->paste(all, m.get()) && irr->paste(all, cf.data()));
    return frame;
}

/// Reads channels of an EXR file with the OpenEXR library; file line 0 first.
std::map<std::string, std::vector<float>> readEXR(const std::string &path,
                                                  const std::vector<std::string> &channels, int &w,
                                                  int &h) {
    Imf::InputFile in(path.c_str());
    const auto dw = in.header().dataWindow();
    w = dw.max.x - dw.min.x + 1;
    h = dw.max.y - dw.min.y + 1;
    std::map<std::string, std::vector<float>> out;
    Imf::FrameBuffer fb;
    for (const std::string &c : channels) {
        out[c].assign(size_t(w) * h, -99.0f);
        fb.insert(c, Imf::Slice(Imf::FLOAT, reinterpret_cast<char *>(out[c].data()), sizeof(float),
                                sizeof(float) * w));
    }
    in.setFrameBuffer(fb);
    in.readPixels(dw.min.y, dw.max.y);
    return out;
}

/// The channels prefix + R, G, B (and A) of a file read by readEXR hold beautyAt; the file's
/// first line is the top row.
void expectBeauty(std::map<std::string, std::vector<float>> px, const std::string &prefix, int w,
                  int h, bool alpha) {
    for (int line = 0; line < h; ++line)
        for (int x = 0; x < w; ++x) {
            const Color c = beautyAt(x, h - 1 - line);
            const size_t i = size_t(line) * w + x;
            ASSERT_EQ(px[prefix + "R"][i], c.r) << x << "," << line;
            ASSERT_EQ(px[prefix + "G"][i], c.g) << x << "," << line;
            ASSERT_EQ(px[prefix + "B"][i], c.b) << x << "," << line;
            if (alpha) {
                ASSERT_EQ(px[prefix + "A"][i], c.a) << x << "," << line;
            }
        }
}

class ImageWriterTest : public oxtest::TempDirTest {
protected:
    ImageWriterTest() : TempDirTest("oximgw_test_") {}
    ox::NilColorCorrection nil_;
};

const int kSizes[][2] = {{1, 1}, {100, 70}, {65, 129}};

TEST_F(ImageWriterTest, MultiLayerEXRRoundTrip) {
    for (auto [w, h] : kSizes) {
        SCOPED_TRACE(std::to_string(w) + "x" + std::to_string(h));
        auto frame = testFrame(w, h);
        ASSERT_TRUE(ox::writeMultiLayerEXR("ml.exr", *frame, true));
        {
            Imf::TiledInputFile tiled("ml.exr");
            const int edge = [](int n) {
                int e = 1;
                while (e < n && e < 32) e <<= 1;
                return e;
            }(w);
            EXPECT_EQ(int(tiled.tileXSize()), edge);
            EXPECT_EQ(tiled.header().compression(), Imf::ZIP_COMPRESSION);
        }
        std::vector<std::string> names;
        {
            Imf::InputFile in("ml.exr");
            for (auto it = in.header().channels().begin(); it != in.header().channels().end(); ++it)
                names.push_back(it.name());
            // One digit per 32 x 32 tile from the bottom tile row up; tiles whose texels all
            // have x >= 40 are background.
            const auto *attr =
                in.header().findTypedAttribute<Imf::StringAttribute>(ox::kActiveTilesAttribute);
            ASSERT_NE(attr, nullptr);
            const int nx = (w - 1) / 32 + 1, ny = (h - 1) / 32 + 1;
            std::string expected;
            for (int ty = 0; ty < ny; ++ty)
                for (int tx = 0; tx < nx; ++tx) expected += tx * 32 < 40 ? '1' : '0';
            EXPECT_EQ(attr->value(), expected);
        }
        EXPECT_EQ(names, (std::vector<std::string>{"Z", "beauty.A", "beauty.B", "beauty.G",
                                                   "beauty.R", "irr0", "irr1", "irr2", "irr3",
                                                   "irr4", "irr5", "mask"}));
        int fw = 0, fh = 0;
        auto px = readEXR("ml.exr", names, fw, fh);
        ASSERT_EQ(fw, w);
        ASSERT_EQ(fh, h);
        expectBeauty(px, "beauty.", w, h, true);
        for (int line = 0; line < h; ++line)
            for (int x = 0; x < w; ++x) {
                const int y = h - 1 - line;
                const size_t i = size_t(line) * w + x;
                ASSERT_EQ(px["Z"][i], zAt(x, y));
                ASSERT_EQ(px["mask"][i], (x + y) % 3 == 0 ? 1.0f : 0.0f);
                ASSERT_EQ(px["irr5"][i], float(5000 + x + y * 0.5));
            }
    }
    // Without alpha there is no beauty.A; without "Z" every tile is active.
    auto frame = testFrame(100, 70);
    frame->deleteLayer("Z");
    ASSERT_TRUE(ox::writeMultiLayerEXR("noz.exr", *frame, false));
    Imf::InputFile in("noz.exr");
    EXPECT_EQ(in.header().channels().findChannel("beauty.A"), nullptr);
    EXPECT_EQ(in.header().typedAttribute<Imf::StringAttribute>(ox::kActiveTilesAttribute).value(),
              "111111111111");
}

TEST_F(ImageWriterTest, CollidingChannelNamesAreRefused) {
    struct Case {
        std::function<void(ox::Frame &)> add;
        const char *channel;
    };
    const std::vector<Case> cases = {
        {[](ox::Frame &f) {
             f.addCustomFloatLayer("a1", 11);
             f.addTiledLayer<float>("a11");
         },
         "a11"},
        {[](ox::Frame &f) {
             f.addTiledLayer<Color>("beauty");
             f.addTiledLayer<float>("beauty.R");
         },
         "beauty.R"},
    };
    for (const Case &c : cases) {
        ox::Frame frame(4, 4);
        c.add(frame);
        std::string out = oxtest::captureOutput(
            [&] { EXPECT_FALSE(ox::writeMultiLayerEXR("c.exr", frame, true)); });
        EXPECT_TRUE(contains(out, "Error writing exr file: ")) << out;
        EXPECT_TRUE(contains(out, std::string("channel ") + c.channel)) << out;
        EXPECT_FALSE(fs::exists("c.exr"));
    }
}

TEST_F(ImageWriterTest, SingleImageEXRRoundTrip) {
    for (auto [w, h] : kSizes)
        for (bool alpha : {false, true}) {
            SCOPED_TRACE(std::to_string(w) + "x" + std::to_string(h));
            auto frame = testFrame(w, h);
            ASSERT_TRUE(ox::writeEXR("one.exr", *frame->getColorLayer("beauty"), alpha));
            Imf::InputFile in("one.exr");
            EXPECT_FALSE(in.header().hasTileDescription());
            EXPECT_EQ(in.header().compression(), Imf::ZIP_COMPRESSION);
            EXPECT_EQ(in.header().dataWindow(), in.header().displayWindow());
            EXPECT_EQ(in.header().channels().findChannel("A") != nullptr, alpha);
            int fw, fh;
            expectBeauty(readEXR("one.exr", {"R", "G", "B"}, fw, fh), "", w, h, false);
        }
}

// The writers compress on the library's threads; a file must not depend on how many. The
// tall image spans several writes of the scan-line writer at every thread count.
TEST_F(ImageWriterTest, EXRBytesSameForAnyThreadCount) {
    auto frame = testFrame(65, 300);
    std::map<std::string, std::string> first;
    for (int threads : {1, 3, 8}) {
        SCOPED_TRACE(threads);
        ox::setImageWriterThreads(threads);
        ASSERT_TRUE(ox::writeEXR("one.exr", *frame->getColorLayer("beauty"), true));
        ASSERT_TRUE(ox::writeMultiLayerEXR("ml.exr", *frame, true));
        for (const char *name : {"one.exr", "ml.exr"}) {
            const std::string bytes = readFile(name);
            ASSERT_FALSE(bytes.empty());
            if (threads == 1)
                first[name] = bytes;
            else
                EXPECT_TRUE(bytes == first[name]) << name;
        }
    }
    ox::setImageWriterThreads(1);
}

TEST_F(ImageWriterTest, TGABytesBottomRowFirst) {
    for (auto [w, h] : kSizes)
        for (bool alpha : {false, true}) {
            auto frame = testFrame(w, h);
            ASSERT_TRUE(ox::writeTGA("t.tga", *frame->getColorLayer("beauty"), alpha, nil_, false));
            const std::string b = readFile("t.tga");
            const int bpp = alpha ? 4 : 3;
            ASSERT_EQ(b.size(), 18u + size_t(w) * h * bpp);
            const std::string header("\0\0\2\0\0\0\0\0\0\0\0\0", 12);
            EXPECT_EQ(b.substr(0, 12), header);
            EXPECT_EQ(uint8_t(b[12]) | uint8_t(b[13]) << 8, w);
            EXPECT_EQ(uint8_t(b[14]) | uint8_t(b[15]) << 8, h);
            EXPECT_EQ(uint8_t(b[16]), alpha ? 32 : 24);
            EXPECT_EQ(uint8_t(b[17]), alpha ? 8 : 0);
            for (int y = 0; y < h; ++y)
                for (int x = 0; x < w; ++x) {
                    const Color c = beautyAt(x, y);
                    const uint8_t *p = reinterpret_cast<const uint8_t *>(b.data()) + 18 +
                                       (size_t(y) * w + x) * bpp;
                    ASSERT_EQ(p[0], uint8_t(std::fmin(c.b * 255.0f, 255.0f)));
                    ASSERT_EQ(p[1], uint8_t(std::fmin(c.g * 255.0f, 255.0f)));
                    ASSERT_EQ(p[2], uint8_t(std::fmin(c.r * 255.0f, 255.0f)));
                    if (alpha) {
                        ASSERT_EQ(p[3], 127);
                    }
                }
        }
}

TEST_F(ImageWriterTest, EightBitConversionAndCorrections) {
    // Truncation without dither, NaN as 0, clamping both ways.
    EXPECT_EQ(ox::toByte(0.999f, nullptr), 254);
    EXPECT_EQ(ox::toByte(std::nanf(""), nullptr), 0);
    EXPECT_EQ(ox::toByte(-3.0f, nullptr), 0);
    EXPECT_EQ(ox::toByte(7.0f, nullptr), 255);
    EXPECT_EQ(ox::toByte(INFINITY, nullptr), 255);
    // Dither rounds up by the fraction: the mean of many draws follows the value.
    ox::Random rng(ox::kProcessRandomSeed);
    double sum = 0.0;
    for (int i = 0; i < 10000; ++i) sum += ox::toByte(100.25f / 255.0f, &rng);
    EXPECT_NEAR(sum / 10000.0, 100.25, 0.05);

    ox::SRGBColorCorrection srgb;
    std::vector<Color> in{Color(0.0031308f, 1.0f, 0.5f, 0.3f)}, out;
    srgb.correct(in, out);
    EXPECT_NEAR(out[0].r, 0.04044994f, 1e-7f);
    EXPECT_NEAR(out[0].g, 1.0f, 1e-6f);
    EXPECT_NEAR(out[0].b, 0.735357f, 1e-5f);
    EXPECT_EQ(out[0].a, 0.3f);
    auto gamma = ox::createColorCorrection(ox::ColorCorrection::Gamma, 2.0f);
    gamma->correct(in, out);
    EXPECT_NEAR(out[0].b, std::sqrt(0.5f), 1e-6f);
    EXPECT_EQ(out[0].a, 0.3f);
    std::string msg = oxtest::captureOutput([&] {
        auto bad = ox::createColorCorrection(ox::ColorCorrection::Gamma, 0.0f);
        bad->correct(in, out);
    });
    EXPECT_EQ(out[0].b, 0.5f);
    EXPECT_TRUE(contains(msg, "[WARNING]")) << msg;

    // Through a writer: corrected, and the same bytes on every run with dither.
    ox::LinearMemoryLayerT<Color> layer("beauty", 3, 1);
    const Color px[3] = {Color(0.5f, 0.25f, 0.999f, 1), Color(std::nanf(""), -1, 2, 0),
                         Color(0.3f, 0.3f, 0.3f, 1)};
    layer.paste(Region(0, 0, 3, 1), px);
    ASSERT_TRUE(ox::writeTGA("g.tga", layer, false, *gamma, false));
    const std::string b = readFile("g.tga");
    EXPECT_EQ(uint8_t(b[18 + 2]), uint8_t(std::sqrt(0.5f) * 255.0f));
    EXPECT_EQ(uint8_t(b[18 + 3]), 255);  // blue 2 clamps
    EXPECT_EQ(uint8_t(b[18 + 5]), 0);    // red NaN
    ASSERT_TRUE(ox::writeTGA("d1.tga", layer, true, nil_, true));
    ASSERT_TRUE(ox::writeTGA("d2.tga", layer, true, nil_, true));
    EXPECT_EQ(readFile("d1.tga"), readFile("d2.tga"));
}

/// Decodes a JPEG file with libjpeg: RGB bytes, file line 0 first.
std::vector<uint8_t> decodeJPEG(const std::string &path, int &w, int &h) {
    std::FILE *f = std::fopen(path.c_str(), "rb");
    jpeg_decompress_struct info;
    jpeg_error_mgr err;
    info.err = jpeg_std_error(&err);
    jpeg_create_decompress(&info);
    jpeg_stdio_src(&info, f);
    jpeg_read_header(&info, TRUE);
    jpeg_start_decompress(&info);
    w = int(info.output_width);
    h = int(info.output_height);
    std::vector<uint8_t> out(size_t(w) * h * 3);
    while (info.output_scanline < info.output_height) {
        JSAMPROW row = out.data() + size_t(info.output_scanline) * w * 3;
        jpeg_read_scanlines(&info, &row, 1);
    }
    jpeg_finish_decompress(&info);
    jpeg_destroy_decompress(&info);
    std::fclose(f);
    return out;
}

TEST_F(ImageWriterTest, JPEGRoundTripTopRowFirst) {
    for (auto [w, h] : kSizes) {
        SCOPED_TRACE(std::to_string(w) + "x" + std::to_string(h));
        auto frame = testFrame(w, h);
        ASSERT_TRUE(ox::writeJPEG("j.jpg", *frame->getColorLayer("beauty"), nil_, false));
        int fw, fh;
        auto px = decodeJPEG("j.jpg", fw, fh);
        ASSERT_EQ(fw, w);
        ASSERT_EQ(fh, h);
        int worst = 0;
        for (int line = 0; line < h; ++line)
            for (int x = 0; x < w; ++x) {
                const Color c = beautyAt(x, h - 1 - line);
                const float v[3] = {c.r, c.g, c.b};
                for (int k = 0; k < 3; ++k)
                    worst = std::max(worst, std::abs(int(px[(size_t(line) * w + x) * 3 + k]) -
                                                     int(ox::toByte(v[k], nullptr))));
            }
        // Quality 100 with chroma subsampling: a few levels at most on smooth gradients.
        EXPECT_LE(worst, 6);
    }
}

TEST_F(ImageWriterTest, FailedWritesLeaveExistingFilesIntact) {
    auto frame = testFrame(100, 70);
    auto &beauty = *frame->getColorLayer("beauty");
    struct Case {
        const char *name;
        std::function<bool()> write;
    };
    const std::vector<Case> cases = {
        {"keep.tga", [&] { return ox::writeTGA("keep.tga", beauty, true, nil_, false); }},
        {"keep.jpg", [&] { return ox::writeJPEG("keep.jpg", beauty, nil_, false); }},
        {"keep.exr", [&] { return ox::writeEXR("keep.exr", beauty, true); }},
        {"keepml.exr", [&] { return ox::writeMultiLayerEXR("keepml.exr", *frame, true); }},
    };
    // Files may not grow beyond 2 KB for the duration: every writer runs out of room half-way.
    signal(SIGXFSZ, SIG_IGN);
    rlimit old;
    getrlimit(RLIMIT_FSIZE, &old);
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        { std::ofstream(c.name) << "precious"; }
        rlimit small = old;
        small.rlim_cur = 2048;
        ASSERT_EQ(setrlimit(RLIMIT_FSIZE, &small), 0);
        bool ok = true;
        std::string out = oxtest::captureOutput([&] { ok = c.write(); });
        setrlimit(RLIMIT_FSIZE, &old);
        EXPECT_FALSE(ok);
        EXPECT_TRUE(contains(out, "[ERROR]")) << out;
        EXPECT_EQ(readFile(c.name), "precious");
    }
    signal(SIGXFSZ, SIG_DFL);
    // No temporary file is left behind.
    int files = 0;
    for (auto &e : fs::directory_iterator(".")) files += e.is_regular_file();
    EXPECT_EQ(files, 4);

    // Sizes beyond the formats, a missing directory: one message, nothing written.
    ox::LinearMemoryLayerT<Color> wide("wide", 70000, 1);
    const std::vector<std::pair<std::function<bool()>, const char *>> refused = {
        {[&] { return ox::writeTGA("keep.tga", wide, false, nil_, false); }, "70000 x 1"},
        {[&] { return ox::writeJPEG("keep.jpg", wide, nil_, false); }, "70000 x 1"},
        {[&] { return ox::writeTGA("no/such/dir/a.tga", beauty, false, nil_, false); },
         "Could not open output file: no/such/dir/a.tga"},
        {[&] { return ox::writeJPEG("no/such/dir/a.jpg", beauty, nil_, false); },
         "JPEGWriter: Could not open output file: no/such/dir/a.jpg"},
        {[&] { return ox::writeEXR("no/such/dir/a.exr", beauty, false); }, "Exr error: "},
    };
    for (auto &[write, text] : refused) {
        bool ok = true;
        std::string out = oxtest::captureOutput([&, &w = write] { ok = w(); });
        EXPECT_FALSE(ok) << text;
        EXPECT_TRUE(contains(out, text)) << out;
    }
    EXPECT_EQ(readFile("keep.tga"), "precious");
}

TEST_F(ImageWriterTest, SaveLayerNamesFilesAndSplitsCustomFloatLayers) {
    EXPECT_EQ(ox::imageFileName(ox::kSaveTGA24, "out.tga", "box", "beauty", "dir/"),
              "dir/out_box_beauty.tga");
    EXPECT_EQ(ox::imageFileName(ox::kSaveJPEG, "out.jpeg", "box", "beauty", ""),
              "out_box_beauty.jpg");
    EXPECT_EQ(ox::imageFileName(ox::kSaveEXR, "out.tga", "box", "beauty", ""),
              "out.tga_box_beauty.exr");
    EXPECT_EQ(ox::imageFileName(ox::kSaveEXR, "", "box", "beauty", ""), "box_beauty.exr");
    EXPECT_EQ(ox::multiLayerFileName("out.exr", "box", "o/"), "o/out_box.exr");
    EXPECT_EQ(ox::multiLayerFileName("", "box", ""), "box.exr");

    auto frame = testFrame(5, 3);
    fs::create_directory("o");
    ASSERT_TRUE(ox::saveLayer(ox::kSaveTGA24, "out", "box", "irr", *frame, nil_, false, "o/"));
    ASSERT_TRUE(fs::exists("o/out_box_irr 0.tga"));
    // The second image holds channels 4 and 5 in red and green, 0 in blue.
    const std::string b = readFile("o/out_box_irr 1.tga");
    ASSERT_EQ(b.size(), 18u + 15 * 3);
    EXPECT_EQ(uint8_t(b[18]), 0);
    EXPECT_EQ(uint8_t(b[19]), 255);  // 5000 clamps
    ASSERT_TRUE(ox::saveLayer(ox::kSaveEXR, "", "box", "beauty", *frame, nil_, false, "o/"));
    EXPECT_TRUE(fs::exists("o/box_beauty.exr"));
    // Nothing to write: success without a file.
    for (int kind : {ox::kSaveNone, ox::kSaveMultiLayerEXR, ox::kSaveTGA32})
        EXPECT_TRUE(ox::saveLayer(kind, "none", "box", kind == ox::kSaveTGA32 ? "Z" : "beauty",
                                  *frame, nil_, false, "o/"));
    EXPECT_EQ(std::distance(fs::directory_iterator("o"), fs::directory_iterator()), 3);
    std::string out = oxtest::captureOutput(
        [&] { EXPECT_FALSE(ox::saveLayer(9, "x", "box", "beauty", *frame, nil_, false, "o/")); });
    EXPECT_TRUE(contains(out, "[ERROR]")) << out;
    // A single-group custom-float layer keeps its plain name.
    frame->addCustomFloatLayer("ao", 2);
    ASSERT_TRUE(ox::saveLayer(ox::kSaveJPEG, "", "box", "ao", *frame, nil_, false, "o/"));
    EXPECT_TRUE(fs::exists("o/box_ao.jpg"));
}

}  // namespace
