#include "core/message.h"

#include <gtest/gtest.h>

#include <fstream>
#include <sstream>
#include <thread>
#include <vector>

#include "tests/support/test_support.h"

namespace {

class MessageTest : public oxtest::TempDirTest {
protected:
    MessageTest() : TempDirTest("ox_message_test_") {}
};

TEST_F(MessageTest, FiltersPrefixesUnknownTypesAndLevelsOutsideTheRange) {
    testing::internal::CaptureStdout();
    ox::message(ox::kMsgDebug, 6, "hidden %d", 1);
    ox::message(ox::kMsgVerbose, 6, "hidden too");
    ox::message(ox::kMsgInfo, 6, "info %d", 2);
    ox::message(ox::kMsgBench, 6, "bench");
    ox::message(3, 6, "three");  // not a known type; its verbose bit is off, its debug bit too
    ox::setTypeEnabled(ox::kMsgDebug, true);
    ox::message(ox::kMsgDebug, 6, "shown %s", "now");
    ox::message(3, 6, "three");  // any enabled bit shows it, with the unknown prefix
    ox::message(ox::kMsgError, -1, "low");
    ox::message(ox::kMsgError, 8, "high");
    ox::message(ox::kMsgError, 1 << 30, "huge");
    ox::setTypeEnabled(ox::kMsgError, false);
    ox::message(ox::kMsgError, 99, "off");
    EXPECT_EQ(testing::internal::GetCapturedStdout(),
              "[INFO]     info 2\n[BENCH]    bench\n[DEBUG]    shown now\n[UNKNOWN]  three\n"
              "[ERROR]    low\n[ERROR]    high\n[ERROR]    huge\n");
    for (uint32_t t : {1u, 2u, 4u, 8u, 16u, 32u, 64u, 3u, 128u})
        EXPECT_EQ(std::string(ox::messagePrefix(t)).size(), 11u);
}

TEST_F(MessageTest, LongMessagesAreCutAndComposedTextIsNeverAFormat) {
    const std::string longText(10000, 'x');
    testing::internal::CaptureStdout();
    ox::message(ox::kMsgInfo, 6, "%s", longText.c_str());
    ox::messageText(ox::kMsgInfo, 6, "100%s %n %d");
    const std::string out = testing::internal::GetCapturedStdout();
    EXPECT_EQ(out.find('\n'), 11 + ox::kMessageBufferSize - 1);
    EXPECT_NE(out.find("[INFO]     100%s %n %d\n"), std::string::npos);
    // Texts formatted for other uses are never cut.
    EXPECT_EQ(ox::formatText("%s|%d", longText.c_str(), 7), longText + "|7");
    EXPECT_EQ(ox::formatText("%s", ""), "");
}

TEST_F(MessageTest, DebugFileGetsBannerAndEveryShownMessage) {
    const std::string file = (dir_ / "debug.out").string();
    std::ofstream(file) << "kept\n";
    ox::OutputVerbosityFlags flags;
    flags.debugFile = true;
    flags.infoPrint = false;
    flags.benchmarkPrint = true;
    testing::internal::CaptureStdout();
    EXPECT_TRUE(ox::applyOutputVerbosity(flags, dir_.string() + "/"));
    ox::message(ox::kMsgInfo, 6, "not shown");
    ox::message(ox::kMsgBench, 6, "shown %d", 7);
    testing::internal::GetCapturedStdout();
    EXPECT_EQ(ox::debugFile(), file);
    std::stringstream text;
    text << std::ifstream(file).rdbuf();
    EXPECT_EQ(text.str(),
              "kept\n +++++++++++++++ KESTRIN RENDERER DEBUG MESSAGES +++++++++++ \n"
              "[BENCH]    shown 7\n");

    // A debug file that cannot be opened is a warning and is forgotten.
    flags.infoPrint = true;
    testing::internal::CaptureStdout();
    EXPECT_FALSE(ox::applyOutputVerbosity(flags, (dir_ / "missing" / "").string()));
    const std::string out = testing::internal::GetCapturedStdout();
    EXPECT_NE(out.find("[WARNING]  Unable to open the debug file"), std::string::npos);
    EXPECT_EQ(ox::debugFile(), "");
}

TEST_F(MessageTest, LinesFromManyThreadsNeverInterleave) {
    testing::internal::CaptureStdout();
    std::vector<std::thread> threads;
    for (int t = 0; t < 4; ++t)
        threads.emplace_back([t] {
            for (int i = 0; i < 200; ++i)
                ox::message(ox::kMsgInfo, 6, "thread %d line %d %s", t, i,
                            std::string(200, char('a' + t)).c_str());
        });
    for (auto &th : threads) th.join();
    std::istringstream in(testing::internal::GetCapturedStdout());
    int count = 0;
    for (std::string line; std::getline(in, line); ++count) {
        ASSERT_EQ(line.rfind("[INFO]     thread ", 0), 0u) << line;
        EXPECT_EQ(line.substr(line.size() - 200), std::string(200, line.back()));
    }
    EXPECT_EQ(count, 800);
}

}  // namespace
