#include "platform/memory_mapped_file.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <optional>
#include <string>
#include <vector>

#include "tests/support/test_support.h"

namespace fs = std::filesystem;

namespace {

/// Each test runs with TMPDIR at its fresh directory; the old value comes back afterwards.
class MemoryMappedFileTest : public oxtest::TempDirTest {
protected:
    MemoryMappedFileTest() : TempDirTest("oxmmf_test_") {}
    void SetUp() override {
        TempDirTest::SetUp();
        if (const char *old = std::getenv("TMPDIR")) oldTmp_ = old;
        setenv("TMPDIR", dir_.c_str(), 1);
    }
    void TearDown() override {
        oldTmp_ ? setenv("TMPDIR", oldTmp_->c_str(), 1) : unsetenv("TMPDIR");
        TempDirTest::TearDown();
    }
    /// Files in the directory whose name starts with "OXR".
    int spillFiles() const {
        int n = 0;
        for (auto &e : fs::directory_iterator(dir_))
            n += e.path().filename().string().rfind("OXR", 0) == 0;
        return n;
    }
    std::optional<std::string> oldTmp_;
};

uint64_t pattern(uint64_t i) { return i * 0x9E3779B97F4A7C15ull ^ (i >> 7); }

TEST_F(MemoryMappedFileTest, SmallBlockLivesInMemory) {
    ox::MemoryMappedFile block(4096);
    ASSERT_TRUE(block.ok());
    EXPECT_FALSE(block.isFileBacked());
    std::vector<unsigned char> bytes(4096, 0xFF);
    ASSERT_TRUE(block.read(0, bytes.data(), 4096));
    for (unsigned char b : bytes) ASSERT_EQ(b, 0);  // zero-filled like a new file
    const char text[] = "tile";
    EXPECT_TRUE(block.write(4092, text, 4));
    EXPECT_FALSE(block.write(4093, text, 4));                   // past the end
    EXPECT_FALSE(block.read(UINT64_MAX - 1, bytes.data(), 4));  // offset + size overflows
    EXPECT_EQ(block.map(4096, 1), nullptr);
    EXPECT_EQ(std::string(static_cast<char *>(block.map(4092, 4)), 4), "tile");
    ox::MemoryMappedFile empty(0);
    EXPECT_TRUE(empty.ok());
}

TEST_F(MemoryMappedFileTest, LargeMemoryBlockOfOddSizeIsZeroedAndWritableToTheLastByte) {
    // Several huge pages and a part of one: the block is aligned and sized in whole pages
    // inside, but holds exactly the bytes asked for.
    const uint64_t size = (5ull << 20) + 12345;
    for (int round = 0; round < 2; ++round) {  // the second block may reuse the first's pages
        ox::MemoryMappedFile block(size);
        ASSERT_TRUE(block.ok());
        EXPECT_FALSE(block.isFileBacked());
        std::vector<uint64_t> words(size / 8, ~0ull);
        ASSERT_TRUE(block.read(0, words.data(), words.size() * 8));
        EXPECT_TRUE(std::all_of(words.begin(), words.end(), [](uint64_t w) { return w == 0; }));
        for (size_t i = 0; i < words.size(); ++i) words[i] = pattern(i);
        ASSERT_TRUE(block.write(0, words.data(), words.size() * 8));
        const unsigned char last = 0xA5;
        EXPECT_TRUE(block.write(size - 1, &last, 1));
        EXPECT_FALSE(block.write(size, &last, 1));
        EXPECT_EQ(static_cast<unsigned char *>(block.map(size - 1, 1))[0], 0xA5);
        uint64_t back = 0;
        ASSERT_TRUE(block.read((size / 16) * 8, &back, 8));
        EXPECT_EQ(back, pattern(size / 16));
    }
}

TEST(HugeBlockTest, GivenBackBlocksServeTheNextRequestOfTheirSizeZeroed) {
    const uint64_t size = (3ull << 20) + 5;  // four huge pages
    auto *a = static_cast<unsigned char *>(ox::allocateHugeBlock(size));
    ASSERT_NE(a, nullptr);
    EXPECT_EQ(reinterpret_cast<uintptr_t>(a) % ox::kHugePage, 0u);
    std::memset(a, 0xC3, size);
    const uint64_t before = ox::keptHugeBytes();
    ox::releaseHugeBlock(a, size);
    EXPECT_EQ(ox::keptHugeBytes(), before + (4ull << 20));
    // The same rounded size takes the kept block back, zero-filled again.
    auto *b = static_cast<unsigned char *>(ox::allocateHugeBlock((4ull << 20) - 1));
    EXPECT_EQ(b, a);
    EXPECT_EQ(ox::keptHugeBytes(), before);
    EXPECT_TRUE(std::all_of(b, b + (4ull << 20) - 1, [](unsigned char v) { return v == 0; }));
    ox::releaseHugeBlock(b, (4ull << 20) - 1);
    // A size not kept makes room first: kept blocks as large as it go, the oldest first.
    const uint64_t keptBefore = ox::keptHugeBytes();
    void *odd = ox::allocateHugeBlock(14ull << 20);
    ASSERT_NE(odd, nullptr);
    EXPECT_LE(ox::keptHugeBytes(),
              keptBefore > (14ull << 20) ? keptBefore - (14ull << 20) : uint64_t(0));
    ox::releaseHugeBlock(odd, 14ull << 20);
    // Blocks beyond what may be kept go at once.
    void *big = ox::allocateHugeBlock(ox::kKeptHugeBytes + 1, false);
    ASSERT_NE(big, nullptr);
    const uint64_t kept = ox::keptHugeBytes();
    ox::releaseHugeBlock(big, ox::kKeptHugeBytes + 1);
    EXPECT_EQ(ox::keptHugeBytes(), kept);
    ox::releaseHugeBlock(nullptr, 0);
}

TEST_F(MemoryMappedFileTest, SpillBlockOf300MiBRoundTripsAndLeavesNoFile) {
    const uint64_t size = 300ull << 20;
    {
        testing::internal::CaptureStdout();
        ox::MemoryMappedFile block(size);
        std::string out = testing::internal::GetCapturedStdout();
        ASSERT_TRUE(block.ok());
        EXPECT_TRUE(block.isFileBacked());
        EXPECT_NE(out.find("Mapping memory to file"), std::string::npos);
        // The name is gone from the directory while the block is alive.
        EXPECT_EQ(spillFiles(), 0);
        // Written in 1 MiB pieces, one range crossing every piece boundary.
        std::vector<uint64_t> chunk((1 << 20) / 8);
        for (uint64_t off = 0; off < size; off += 1 << 20) {
            for (size_t i = 0; i < chunk.size(); ++i) chunk[i] = pattern(off / 8 + i);
            ASSERT_TRUE(block.write(off, chunk.data(), 1 << 20));
        }
        for (uint64_t mib = 1; mib < 300; mib += 37) {
            const uint64_t off = (mib << 20) - 24;  // straddles a piece boundary
            std::vector<uint64_t> back(chunk.size());
            ASSERT_TRUE(block.read(off, back.data(), 1 << 20));
            for (size_t i = 0; i < back.size(); ++i) ASSERT_EQ(back[i], pattern(off / 8 + i));
        }
        const uint64_t *all = static_cast<const uint64_t *>(block.map(0, size));
        ASSERT_NE(all, nullptr);
        for (uint64_t i = 0; i < size / 8; i += 4099) ASSERT_EQ(all[i], pattern(i)) << i;
        EXPECT_EQ(all[size / 8 - 1], pattern(size / 8 - 1));
    }
    EXPECT_EQ(spillFiles(), 0);
}

TEST_F(MemoryMappedFileTest, SpillFailureReportsAndIsNotOk) {
    setenv("TMPDIR", "/nonexistent/ox-no-such-dir", 1);
    testing::internal::CaptureStdout();
    ox::MemoryMappedFile block(2 << 20, 1 << 20);
    std::string out = testing::internal::GetCapturedStdout();
    EXPECT_FALSE(block.ok());
    EXPECT_NE(out.find("[ERROR]    Cannot create temporary file"), std::string::npos) << out;
    // The info line of the spill and exactly one error line.
    EXPECT_EQ(std::count(out.begin(), out.end(), '\n'), 2) << out;
    char c = 0;
    EXPECT_FALSE(block.read(0, &c, 1));
    EXPECT_FALSE(block.write(0, &c, 1));
}

}  // namespace
