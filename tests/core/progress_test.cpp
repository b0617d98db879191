#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <sstream>

#include "core/message.h"
#include "core/render_io_console.h"

namespace {

std::vector<std::string> lines(const std::string &text) {
    std::vector<std::string> out;
    std::istringstream in(text);
    std::string l;
    while (std::getline(in, l)) out.push_back(l);
    return out;
}

TEST(RioImpl, MarksAreCountedSoTheLastReadsHundred) {
    ox::resetMessageFilters();
    ox::RioImpl rio;
    testing::internal::CaptureStdout();
    rio.setProgress(1.0f);
    rio.finish();
    const auto out = lines(testing::internal::GetCapturedStdout());
    ASSERT_EQ(out.size(), 10u);
    EXPECT_EQ(out.front(), "[PROGRESS] Progress 10.0%");
    EXPECT_EQ(out.back(), "[PROGRESS] Progress 100.0%");
    // Fractions that reach a mark only up to rounding still print it.
    ox::RioImpl many;
    testing::internal::CaptureStdout();
    for (int i = 1; i <= 1000; ++i) many.setProgress(static_cast<float>(i) / 1000.0f);
    many.finish();
    const auto fine = lines(testing::internal::GetCapturedStdout());
    ASSERT_EQ(fine.size(), 10u);
    EXPECT_EQ(fine[2], "[PROGRESS] Progress 30.0%");
    EXPECT_EQ(fine.back(), "[PROGRESS] Progress 100.0%");
}

TEST(RioImpl, NewPhasesHostileValuesAndAbort) {
    ox::resetMessageFilters();
    ox::RioImpl rio;
    testing::internal::CaptureStdout();
    rio.setProgress(0.25f);                                    // 10, 20
    rio.setProgress(0.15f);                                    // new phase: 10
    rio.setProgress(std::numeric_limits<float>::quiet_NaN());  // ignored
    rio.setProgress(std::numeric_limits<float>::infinity());   // clamped: up to 100
    rio.setProgress(1e30f);
    rio.setProgress(-5.0f);  // a new phase that has not begun
    auto out = lines(testing::internal::GetCapturedStdout());
    ASSERT_EQ(out.size(), 2u + 1u + 9u);
    EXPECT_EQ(out[2], "[PROGRESS] Progress 10.0%");
    EXPECT_EQ(out[3], "[PROGRESS] Progress 20.0%");
    EXPECT_EQ(out.back(), "[PROGRESS] Progress 100.0%");
    EXPECT_EQ(rio.lastProgress(), 0.0f);

    testing::internal::CaptureStdout();
    rio.setProgressTitle("bake %s of %n");
    rio.abort();
    rio.finish();
    out = lines(testing::internal::GetCapturedStdout());
    EXPECT_EQ(out, (std::vector<std::string>{"[PROGRESS] Progress Title: bake %s of %n",
                                             "[PROGRESS] Aborted!"}));
    EXPECT_TRUE(rio.isAborted());
}

TEST(RioImpl, BadStepsAreReplacedSoEveryCallTerminates) {
    ox::resetMessageFilters();
    for (float step : {0.0f, -1.0f, std::numeric_limits<float>::quiet_NaN(), 1e-30f, 5.0f}) {
        ox::RioImpl rio(step);
        EXPECT_GT(rio.step(), 0.0f);
        EXPECT_LE(rio.step(), 1.0f);
        testing::internal::CaptureStdout();
        rio.setProgress(std::numeric_limits<float>::infinity());
        const auto out = lines(testing::internal::GetCapturedStdout());
        EXPECT_LE(out.size(), static_cast<size_t>(std::ceil(1.0f / rio.step())) + 1);
        EXPECT_EQ(out.back(), "[PROGRESS] Progress 100.0%");
    }
}

}  // namespace
