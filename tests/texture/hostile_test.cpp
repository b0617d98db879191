// Hostile files for every reader: truncated at many offsets, flipped bytes, huge sizes, bad run
// lengths and wrong magic. Each must fail (or succeed) cleanly; run under the address and
// undefined-behaviour sanitizers this finds every out-of-bounds access.

#include <gtest/gtest.h>
#include <zlib.h>

#include <algorithm>
#include <array>
#include <filesystem>

#include "core/random.h"
#include "tests/support/test_support.h"
#include "tests/texture/image_files.h"
#include "texture/image_reader.h"

namespace {

using oxtest::Bytes;
using testing::internal::CaptureStdout;
using testing::internal::GetCapturedStdout;

const ox::ReaderRegistry &registry() {
    static const ox::ReaderRegistry r;
    return r;
}

bool decode(const std::string &ext, const Bytes &b, const ox::ReadLimits &limits = {}) {
    ox::TexelBuffer out;
    const bool ok =
        ox::decodeImage(registry(), ext, "hostile." + ext, b.data(), b.size(), {}, limits, out);
    // A failed read leaves no half-filled buffer behind.
    EXPECT_TRUE(ok || out.empty());
    return ok;
}

/// One valid sample of each format, made in memory (TIFF and EXR through a file).
std::vector<std::pair<std::string, Bytes>> samples() {
    const oxtest::Picture p = oxtest::testPicture(13, 9);
    std::vector<std::array<uint8_t, 4>> rgbe(13 * 9);
    for (size_t i = 0; i < rgbe.size(); ++i) oxtest::rgbe(float(i % 3), 1.0f, 0.5f, rgbe[i].data());
    std::vector<std::pair<std::string, Bytes>> s = {
        {"tga", oxtest::makeTGA(p, false, false, true, false, true)},
        {"tga", oxtest::makeTGA(p, true, false, false, true, false)},
        {"tga", oxtest::makeTGA(p, true, true, false, false, true)},
        {"bmp", oxtest::makeBMP(p, 24, true)},
        {"bmp", oxtest::makeBMP(p, 32, false)},
        {"hdr", oxtest::makeHDR(13, 9, rgbe, true, true)},
        {"hdr", oxtest::makeHDR(13, 9, rgbe, false, false)},
        {"dds", oxtest::makeDDS(13, 9, "DXT1", Bytes(4 * 3 * 8, 0x5a))},
        {"dds", oxtest::makeDDS(13, 9, "DXT5", Bytes(4 * 3 * 16, 0xa5))},
        {"png", oxtest::makePNG(p, PNG_COLOR_TYPE_RGBA, 16)},
        {"png", oxtest::makePNG(p, PNG_COLOR_TYPE_PALETTE, 8)},
        {"jpg", oxtest::makeJPEG(p, false)},
    };
    const std::string dir =
        std::filesystem::temp_directory_path() / ("ox_hostile_" + std::to_string(::getpid()));
    std::filesystem::create_directories(dir);
    auto f = [](int x, int y, int c) { return float(x - y + c); };
    if (oxtest::writeTIFF<float>(dir + "/a.tif", 13, 9, 3, SAMPLEFORMAT_IEEEFP, false, f))
        s.push_back({"tif", oxtest::readBytes(dir + "/a.tif")});
    auto g = [](int x, int y, int c) { return uint16_t(x * y + c); };
    if (oxtest::writeTIFF<uint16_t>(dir + "/b.tif", 40, 20, 2, SAMPLEFORMAT_UINT, true, g))
        s.push_back({"tif", oxtest::readBytes(dir + "/b.tif")});
    oxtest::writeEXR(dir + "/c.exr", 13, 9, {"R", "G", "B", "A"}, Imf::FLOAT, 8,
                     [](int, int, int) { return 0.5f; });
    s.push_back({"exr", oxtest::readBytes(dir + "/c.exr")});
    std::filesystem::remove_all(dir);
    return s;
}

TEST(HostileImages, TruncatedAtEveryOffsetFailsCleanly) {
    CaptureStdout();
    for (const auto &[ext, bytes] : samples()) {
        ASSERT_TRUE(decode(ext, bytes)) << "the untouched " << ext << " sample";
        const size_t step = std::max<size_t>(1, bytes.size() / 400);
        for (size_t n = 0; n < bytes.size(); n += step) {
            const Bytes cut(bytes.begin(), bytes.begin() + ptrdiff_t(n));
            // Under half the file no format can hold the picture.
            if (!decode(ext, cut)) continue;
            EXPECT_GT(n, bytes.size() / 2) << ext << " truncated to " << n << " bytes decoded";
        }
    }
    GetCapturedStdout();
}

TEST(HostileImages, FlippedBytesNeverReadOutOfBounds) {
    ox::Random rng(262484787);
    CaptureStdout();
    for (const auto &[ext, bytes] : samples()) {
        for (int round = 0; round < 150; ++round) {
            Bytes b = bytes;
            const int flips = 1 + round % 4;
            // Headers get most of the damage: that is where sizes and counts live.
            for (int k = 0; k < flips; ++k) {
                const size_t limit = round % 2 ? b.size() : std::min<size_t>(b.size(), 160);
                const size_t at = size_t(rng.nextIndex(int64_t(limit)));
                b[at] = uint8_t(rng.nextIndex(256));
            }
            decode(ext, b);
        }
    }
    GetCapturedStdout();
}

/// Rewrites the IHDR size of a PNG and its checksum.
Bytes pngWithSize(Bytes b, uint32_t w, uint32_t h) {
    for (int i = 0; i < 4; ++i)
        b[16 + i] = uint8_t(w >> (24 - 8 * i)), b[20 + i] = uint8_t(h >> (24 - 8 * i));
    const uLong crc = crc32(0, b.data() + 12, 17);
    for (int i = 0; i < 4; ++i) b[29 + i] = uint8_t(crc >> (24 - 8 * i));
    return b;
}

TEST(HostileImages, HugeSizesAreRefusedBeforeAllocation) {
    const oxtest::Picture p = oxtest::testPicture(4, 4);
    auto patch = [](Bytes b, size_t at, std::initializer_list<uint8_t> v) {
        for (uint8_t x : v) b[at++] = x;
        return b;
    };
    const Bytes tga = oxtest::makeTGA(p, true, false, true, false, false);
    const Bytes bmp = oxtest::makeBMP(p, 32, false);
    const Bytes dds = oxtest::makeDDS(4, 4, "DXT1", Bytes(8, 0));
    const Bytes png = oxtest::makePNG(p, PNG_COLOR_TYPE_RGBA, 8);
    const std::string hdrHead =
        "#?RADIANCE\nFORMAT=32-bit_rle_rgbe\n\n-Y 2000000000 +X 2000000000\n";
    const std::string hdrMid = "#?RADIANCE\nFORMAT=32-bit_rle_rgbe\n\n-Y 9000 +X 9000\n";
    struct Case {
        const char *what, *ext;
        Bytes bytes;
    };
    const Case cases[] = {
        {"tga 65535 x 65535 of run-length data", "tga", patch(tga, 12, {0xff, 0xff, 0xff, 0xff})},
        {"tga 4000 x 4000 uncompressed", "tga",
         patch(oxtest::makeTGA(p, false, false, true, false, false), 12, {0xa0, 0x0f, 0xa0, 0x0f})},
        {"bmp 2^31-1 wide", "bmp", patch(bmp, 18, {0xff, 0xff, 0xff, 0x7f})},
        {"bmp most negative height", "bmp", patch(bmp, 22, {0x00, 0x00, 0x00, 0x80})},
        {"bmp -30000 high", "bmp", patch(bmp, 22, {0xd0, 0x8a, 0xff, 0xff})},
        {"bmp pixel offset past the end", "bmp", patch(bmp, 10, {0xff, 0xff, 0xff, 0x0f})},
        {"dds 2^31-1 square", "dds",
         patch(dds, 12, {0xff, 0xff, 0xff, 0x7f, 0xff, 0xff, 0xff, 0x7f})},
        {"dds 2^32-1 wide", "dds", patch(dds, 16, {0xff, 0xff, 0xff, 0xff})},
        {"png 1000000 square", "png", pngWithSize(png, 1000000, 1000000)},
        {"png 2^31-1 wide", "png", pngWithSize(png, 0x7fffffff, 1)},
        {"hdr 2e9 square", "hdr", Bytes(hdrHead.begin(), hdrHead.end())},
        {"hdr 9000 square of nothing", "hdr", Bytes(hdrMid.begin(), hdrMid.end())},
    };
    // EXR: a data window of 2^31 rows (the chunk table would not fit in the file) and an
    // attribute claiming 2 GiB of value.
    const Bytes exr = samples().back().second;
    auto find = [&](const char *text) {
        const std::string t(text, std::strlen(text) + 1);
        return size_t(std::search(exr.begin(), exr.end(), t.begin(), t.end()) - exr.begin());
    };
    const size_t window = find("dataWindow") + 11 + 6 + 4;  // name, "box2i", size
    const size_t channels = find("channels") + 9 + 7;       // name, "chlist"
    ASSERT_LT(window + 16, exr.size());
    CaptureStdout();
    EXPECT_TRUE(decode("exr", exr));
    EXPECT_FALSE(decode("exr", patch(exr, window + 12, {0xf0, 0xff, 0xff, 0x7f})));
    EXPECT_FALSE(decode("exr", patch(exr, channels, {0xff, 0xff, 0xff, 0x7f})));
    for (const Case &c : cases) EXPECT_FALSE(decode(c.ext, c.bytes)) << c.what;
    // Within the file but over the limit of one image.
    ox::ReadLimits small;
    small.maxImageBytes = 4 * 4 * 4 - 1;
    EXPECT_FALSE(decode("tga", tga, small));
    EXPECT_FALSE(decode("png", png, small));
    const std::string out = GetCapturedStdout();
    EXPECT_NE(out.find("exceeds the limit of 63 bytes"), std::string::npos);
}

TEST(HostileImages, BadRunLengthsAndWrongMagic) {
    CaptureStdout();
    // TGA: a raw packet that claims more texels than the file holds.
    Bytes tga = oxtest::makeTGA(oxtest::testPicture(4, 2), true, false, false, false, false);
    tga.resize(18 + 3);
    tga.push_back(0x7f);  // 128 raw texels follow; not even the 8 of the picture do
    tga.insert(tga.end(), 10, 1);
    EXPECT_FALSE(decode("tga", tga));
    // A run longer than the picture is cut at its end and the picture decodes.
    Bytes run = oxtest::makeTGA(oxtest::testPicture(4, 2), true, false, false, false, false);
    run.resize(18 + 3);
    run.insert(run.end(), {0xff, 1, 2, 3});
    EXPECT_TRUE(decode("tga", run));

    // HDR: new-style runs longer than the row, zero counts and a wrong scan-line width.
    const std::string head = "#?RADIANCE\nFORMAT=32-bit_rle_rgbe\n\n-Y 1 +X 8\n";
    auto hdr = [&](std::initializer_list<uint8_t> row) {
        Bytes b(head.begin(), head.end());
        b.insert(b.end(), row);
        b.resize(b.size() + 64, 0);
        return b;
    };
    EXPECT_FALSE(decode("hdr", hdr({2, 2, 0, 8, 128 + 9, 1})));  // run of 9 in a row of 8
    EXPECT_FALSE(decode("hdr", hdr({2, 2, 0, 8, 0})));           // zero-length literal
    EXPECT_FALSE(decode("hdr", hdr({2, 2, 0, 9, 128 + 8, 1})));  // header for 9 texels
    EXPECT_FALSE(decode("hdr", hdr({1, 1, 1, 200})));            // repeat with nothing before
    const std::string xyze = "#?RADIANCE\nFORMAT=32-bit_rle_xyze\n\n-Y 1 +X 1\n\1\1\1\1";
    EXPECT_FALSE(decode("hdr", Bytes(xyze.begin(), xyze.end())));

    // Wrong magic for every format.
    for (const auto &[ext, bytes] : samples()) {
        Bytes b = bytes;
        if (ext == "tga")
            b[2] = 7;  // TGA has no magic: an image type it does not know
        else
            for (size_t i = 0; i < std::min<size_t>(4, b.size()); ++i) b[i] ^= 0x5a;
        EXPECT_FALSE(decode(ext, b)) << ext;
    }
    // DDS header checks with their messages.
    Bytes dds = oxtest::makeDDS(4, 4, "DXT1", Bytes(8, 0));
    Bytes cube = dds;
    cube[113] = 0x02;  // caps2 cube map
    Bytes dxt9 = dds;
    dxt9[87] = '9';
    Bytes plain = dds;
    plain[80] = 0x40;  // RGB, not four-CC
    Bytes header = dds;
    header[4] = 100;
    for (const Bytes &b : {cube, dxt9, plain, header}) EXPECT_FALSE(decode("dds", b));
    const std::string out = GetCapturedStdout();
    for (const char *m :
         {"Volume and cube map DDS files not supported", "Unsupported compression type in DDS file",
          "Reading of non compressed DDS files not supported",
          "Invalid header size in DDS file (100)", "Invalid Magic Number in DDS file (hostile.dds)",
          "Unsupported image format in tga file hostile.tga (imageType = 7)",
          "Unable to read HDRImage hostile.hdr"})
        EXPECT_NE(out.find(m), std::string::npos) << m;
}

}  // namespace
