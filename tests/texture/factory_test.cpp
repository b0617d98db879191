#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <thread>

#include "tests/support/test_support.h"
#include "tests/texture/image_files.h"
#include "texture/texture_factory.h"

namespace {

namespace fs = std::filesystem;
using testing::internal::CaptureStdout;
using testing::internal::GetCapturedStdout;

class TextureFactoryTest : public oxtest::TempDirTest {
protected:
    TextureFactoryTest() : TempDirTest("ox_texture_factory_") {}
    void SetUp() override {
        TempDirTest::SetUp();
        ::unsetenv(ox::kTextureCacheEnvironment);
        oxtest::writeBytes(
            "pic.tga", oxtest::makeTGA(oxtest::testPicture(9, 6), true, false, true, false, true));
    }
    static const ox::MipImage *imageOf(const std::unique_ptr<ox::OXTexture> &t) {
        auto *it = dynamic_cast<const ox::ImageTexture *>(t.get());
        return it ? it->image().get() : nullptr;
    }
    static void expectSameImage(const ox::MipImage &a, const ox::MipImage &b) {
        ASSERT_EQ(a.levelCount(), b.levelCount());
        for (int l = 0; l < a.levelCount(); ++l) {
            ASSERT_EQ(a.level(l).format(), b.level(l).format());
            ASSERT_EQ(a.level(l).sizeBytes(), b.level(l).sizeBytes());
            EXPECT_EQ(std::memcmp(a.level(l).data(), b.level(l).data(), a.level(l).sizeBytes()), 0)
                << "level " << l;
        }
    }
};

TEST_F(TextureFactoryTest, EachFileIsReadOnceAndSharedByEveryFilter) {
    ox::TextureFactory f;
    auto a = f.getTexture("pic.tga", ox::kFilterEWA);
    auto b = f.getTexture("pic.tga", ox::kFilterPrepass);
    auto c = f.getTexture("pic.tga", 99);
    ASSERT_TRUE(a && b && c);
    EXPECT_EQ(f.sourceReads(), 1u);
    EXPECT_EQ(imageOf(a), imageOf(b));
    EXPECT_NE(dynamic_cast<ox::EWATexture *>(a.get()), nullptr);
    EXPECT_NE(dynamic_cast<ox::PrepassMipMapTexture *>(b.get()), nullptr);
    EXPECT_NE(dynamic_cast<ox::MipMapTexture *>(c.get()), nullptr);
    EXPECT_EQ(a->resolution(), (ox::Vec2i{9, 6}));
    EXPECT_EQ(imageOf(a)->levelCount(), 4);  // 9x6, 4x3, 2x1, 1x1
    // Other reader options are another entry.
    ox::ReaderOptions layer;
    layer.layer = "x";
    auto d = f.getTexture("pic.tga", ox::kFilterSimple, layer);
    EXPECT_EQ(f.sourceReads(), 2u);
    EXPECT_NE(imageOf(d), imageOf(a));
    // A texture outlives its factory.
    std::unique_ptr<ox::OXTexture> kept;
    {
        ox::TextureFactory gone;
        kept = gone.getTexture("pic.tga", ox::kFilterEWA);
    }
    EXPECT_EQ(kept->lookup({0.3f, 0.6f}), a->lookup({0.3f, 0.6f}));
}

TEST_F(TextureFactoryTest, ThreadsAskingForOneFileGetOneRead) {
    ox::TextureFactory f;
    std::vector<std::thread> threads;
    std::vector<const ox::MipImage *> seen(8);
    std::vector<std::unique_ptr<ox::OXTexture>> textures(8);
    for (int i = 0; i < 8; ++i)
        threads.emplace_back([&, i] { textures[size_t(i)] = f.getTexture("pic.tga", i % 5); });
    for (auto &t : threads) t.join();
    EXPECT_EQ(f.sourceReads(), 1u);
    for (auto &t : textures) EXPECT_EQ(imageOf(t), imageOf(textures[0]));
}

TEST_F(TextureFactoryTest, FilesThatCannotBeReadGiveNoTextureAndOneMessage) {
    oxtest::writeBytes("bad.png", {1, 2, 3});
    oxtest::writeBytes(
        "big.tga", oxtest::makeTGA(oxtest::testPicture(64, 64), false, false, true, false, false));
    ox::TextureSettings small;
    small.maxImageBytes = 64 * 64 * 4 - 1;
    ox::TextureFactory f(small);
    CaptureStdout();
    EXPECT_EQ(f.getTexture("vendrel://host/node", 1), nullptr);
    EXPECT_EQ(f.getTexture("missing.tga", 1), nullptr);
    EXPECT_EQ(f.getTexture("dir.v2/texture", 1), nullptr);
    EXPECT_EQ(f.getTexture("bad.png", 1), nullptr);
    EXPECT_EQ(f.getTexture("bad.png", 2), nullptr);  // not tried again
    EXPECT_EQ(f.getTexture("big.tga", 2), nullptr);
    const std::string out = GetCapturedStdout();
    EXPECT_NE(out.find("No image reader for extension vendrel registered"), std::string::npos);
    EXPECT_NE(out.find("No image reader for extension  registered"), std::string::npos);
    EXPECT_NE(out.find("Error opening texture missing.tga (No such file or directory)"),
              std::string::npos);
    EXPECT_NE(out.find("Error opening texture bad.png (not a PNG file)"), std::string::npos);
    EXPECT_NE(out.find("Image big.tga of 64x64 with 4 channels of 8 bits exceeds the limit of "
                       "16383 bytes"),
              std::string::npos);
    EXPECT_EQ(f.sourceReads(), 2u);
}

TEST_F(TextureFactoryTest, ALayoutWithoutBufferBecomesEightBitRGBA) {
    // A reader announcing 12 bits: the image is converted, never written in another layout.
    struct Reader final : ox::ImageReader {
        bool open(const std::string &, const uint8_t *, size_t,
                  const ox::ReaderOptions &) override {
            info_.width = 3, info_.height = 2, info_.bitsPerChannel = 12;
            return true;
        }
        bool readPixels(ox::TexelBuffer &out, const ox::ReadLimits &) override {
            if (!out.allocate("odd", 3, 2, {ox::TexelType::kU16, 1})) return false;
            for (int i = 0; i < 6; ++i)
                reinterpret_cast<uint16_t *>(out.data())[i] = uint16_t(i * 13107);
            return true;
        }
    };
    struct Factory final : ox::IRFactory {
        std::unique_ptr<ox::ImageReader> create() const override {
            return std::make_unique<Reader>();
        }
    };
    oxtest::writeBytes("pic.odd", {0});
    ox::TextureFactory f;
    ASSERT_TRUE(f.registerReader("ODD", std::make_shared<Factory>()));
    CaptureStdout();
    auto t = f.getTexture("pic.odd", 0);
    const std::string out = GetCapturedStdout();
    ASSERT_TRUE(t);
    EXPECT_NE(out.find("Could not create appropriate texelbuffer for 12, 3. Defaulting to 8, 4"),
              std::string::npos);
    EXPECT_EQ(imageOf(t)->level(0).format(), (ox::TexelFormat{ox::TexelType::kU8, 4}));
    ox::Color px[6];
    ASSERT_TRUE(t->readPixels({0, 0, 3, 2}, px));
    EXPECT_FLOAT_EQ(px[5].g, 1.0f);
    EXPECT_FLOAT_EQ(px[1].r, 51 / 255.0f);
}

TEST_F(TextureFactoryTest, CacheIsWrittenReusedRefreshedAndRepaired) {
    ox::TextureSettings s;
    s.cacheDirectory = "cache";
    std::unique_ptr<ox::OXTexture> original;
    std::string cacheFile;
    {
        ox::TextureFactory f(s);
        original = f.getTexture("pic.tga", 2);
        ASSERT_TRUE(original);
        cacheFile = f.cache()->cacheFileName("pic.tga", {});
        EXPECT_TRUE(fs::exists(cacheFile));
        EXPECT_EQ(fs::path(cacheFile).extension(), ".exr");
        EXPECT_EQ(fs::path(cacheFile).stem().string().size(), 16u);
        // The same file named another way has the same cache file.
        EXPECT_EQ(f.cache()->cacheFileName((dir_ / "pic.tga").string(), {}), cacheFile);
    }
    auto fromCache = [&](uint64_t wantCacheReads, const char *what) {
        ox::TextureFactory f(s);
        CaptureStdout();
        auto t = f.getTexture("pic.tga", 2);
        const std::string out = GetCapturedStdout();
        EXPECT_EQ(f.cacheReads(), wantCacheReads) << what;
        EXPECT_EQ(f.sourceReads(), 1 - wantCacheReads) << what;
        if (t) expectSameImage(*imageOf(t), *imageOf(original));
        return out;
    };
    fromCache(1, "current cache");
    std::vector<std::string> entries;
    for (auto &e : fs::directory_iterator("cache")) entries.push_back(e.path().string());
    EXPECT_EQ(entries.size(), 1u);  // no temporary file left behind

    // A changed source is read again (and recached).
    oxtest::writeBytes(
        "pic.tga", oxtest::makeTGA(oxtest::testPicture(9, 6), false, false, true, false, false));
    fromCache(0, "changed source");
    fromCache(1, "recached");

    // A damaged cache file: warning, the source is used, the file is rewritten.
    oxtest::Bytes bytes = oxtest::readBytes(cacheFile);
    bytes.resize(bytes.size() / 2);
    oxtest::writeBytes(cacheFile, bytes);
    std::string out = fromCache(0, "damaged");
    EXPECT_NE(out.find("Failed to load cached texture for file pic.tga"), std::string::npos) << out;
    fromCache(1, "repaired");

    // A read-only cache that has no copy falls back and writes nothing.
    fs::remove(cacheFile);
    s.cacheReadOnly = true;
    out = fromCache(0, "read-only");
    EXPECT_NE(out.find("Read only cache can't find/use texture for file pic.tga, falling back"),
              std::string::npos);
    EXPECT_FALSE(fs::exists(cacheFile));
}

TEST_F(TextureFactoryTest, CacheOfAnHDRImageKeepsItsLayoutAndTheEnvironmentTurnsItOn) {
    std::vector<std::array<uint8_t, 4>> texels(20 * 10);
    for (size_t i = 0; i < texels.size(); ++i)
        oxtest::rgbe(float(i) * 0.37f, 2.0f, 0.001f * float(i), texels[i].data());
    oxtest::writeBytes("sky.hdr", oxtest::makeHDR(20, 10, texels, true, true));
    ::setenv(ox::kTextureCacheEnvironment, "envcache", 1);
    std::unique_ptr<ox::OXTexture> first;
    {
        ox::TextureFactory f;
        ASSERT_NE(f.cache(), nullptr);
        first = f.getTexture("sky.hdr", 1);
        ASSERT_TRUE(first);
        EXPECT_TRUE(first->isHDR());
    }
    ox::TextureFactory f;
    auto second = f.getTexture("sky.hdr", 1);
    ::unsetenv(ox::kTextureCacheEnvironment);
    EXPECT_EQ(f.cacheReads(), 1u);
    ASSERT_TRUE(second);
    EXPECT_TRUE(second->isHDR());
    expectSameImage(*imageOf(second), *imageOf(first));
    EXPECT_EQ(ox::TextureFactory().cache(), nullptr);
}

}  // namespace
