#include "core/timer.h"

#include <gtest/gtest.h>

#include <thread>

#include "core/benchmark.h"
#include "core/message.h"
#include "core/run_statistics.h"

namespace {

TEST(Timer, FormatFields) {
    EXPECT_EQ(ox::Timer().format(), "00:00:00.00");
    EXPECT_EQ(ox::Timer::formatSeconds(3725.5), "01:02:05.50");
    EXPECT_EQ(ox::Timer::formatSeconds(59.999), "00:00:59.99");
    EXPECT_EQ(ox::Timer::formatSeconds(360000.0), "100:00:00.00");
    EXPECT_EQ(ox::Timer::formatSeconds(-3.0), "00:00:00.00");
}

TEST(Timer, NestingCountsUnmatchedStopsAndOverhead) {
    ox::resetMessageFilters();
    ox::Timer t;
    t.start();
    t.start();  // nested: neither counted nor restarted
    EXPECT_EQ(t.stop(), 0.0);
    EXPECT_EQ(t.depth(), 1);
    std::this_thread::sleep_for(std::chrono::milliseconds(2));
    EXPECT_GT(t.stop(), 0.001);
    EXPECT_EQ(t.startCount(), 1);

    testing::internal::CaptureStdout();
    ox::Timer lone;
    EXPECT_EQ(lone.stop(), 0.0);
    ox::Timer running;
    running.start();
    running.add(t);
    EXPECT_EQ(testing::internal::GetCapturedStdout(),
              "[WARNING]  Unmatched start()/stop() in Timer! (-1)\n"
              "[WARNING]  Timer must be stopped for doing adds! (1, 0)\n");
    EXPECT_EQ(running.ticks(), t.ticks());  // added in any case
    // After the unmatched stop the timer works again.
    lone.start();
    lone.stop();
    EXPECT_EQ(lone.startCount(), 1);
    EXPECT_EQ(lone.depth(), 0);

    running.start(true);  // reset forgets the added time
    EXPECT_EQ(running.ticks(), 0);
    EXPECT_EQ(running.startCount(), 1);

    // Empty intervals minus the measured call overhead never add up to a negative time.
    ox::Timer empty;
    for (int i = 0; i < 10000; ++i) {
        empty.start();
        empty.stop();
    }
    EXPECT_GE(empty.ticks(), 0);
}

TEST(Benchmarks, PerThreadTimersAreSummedInTheReport) {
    ox::resetMessageFilters();
    ox::setTypeEnabled(ox::kMsgBench, true);
    auto &registry = ox::BenchmarkRegistry::instance();
    EXPECT_EQ(registry.registerBenchmark("mergePointBench"), ox::kMergePointBench);  // no twin
    registry.clearTimers();

    std::thread a([&] {
        ox::ScopedBenchmark b(ox::kMergePointBench);
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    });
    a.join();
    {
        ox::ScopedBenchmark b(ox::kMergePointBench);
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    EXPECT_GT(registry.totalSeconds(ox::kMergePointBench), 0.009);
    testing::internal::CaptureStdout();
    registry.report();
    const std::string out = testing::internal::GetCapturedStdout();
    EXPECT_EQ(out.find("Benchmark for loadInputsWhileMergingBench"), std::string::npos);
    for (const char *part : {"[BENCH]    Benchmark for mergePointBench:\n[BENCH]     : 00:00:00.",
                             "(1)\n[BENCH]     : 00:00:00.", "[BENCH]     Total:    00:00:00."})
        EXPECT_NE(out.find(part), std::string::npos) << part << "\n" << out;
    registry.clearTimers();
    ox::resetMessageFilters();
}

TEST(RunStatistics, TreeCountersAndPrint) {
    ox::resetMessageFilters();
    ox::setTypeEnabled(ox::kMsgBench, true);
    ox::RunStatistics stats;
    stats.beginPass("beauty");
    stats.beginTarget("wall%s");
    stats.count("rays", 5000000000ull);  // beyond 32 bits
    stats.count("rays", 1);
    stats.count("texels");
    stats.beginCommand("render");
    stats.beginCommand("dilate");  // closes "render"
    stats.beginTarget("floor");    // closes "dilate" and "wall%s"
    stats.beginPass("ao");         // closes "floor" and "beauty"
    stats.beginCommand("render");  // opens an unnamed target
    testing::internal::CaptureStdout();
    stats.print();
    std::string out = testing::internal::GetCapturedStdout();
    // Times vary; blank them out before comparing.
    for (size_t p; (p = out.find(" (00:00:00.")) != std::string::npos;) out.replace(p, 14, " (T)");
    EXPECT_EQ(out,
              "[BENCH]    Statistics for this run:\n"
              "[BENCH]    Pass 1: beauty (T)\n"
              "[BENCH]        Target 1: wall%s (T)\n"
              "[BENCH]        rays: 5000000001\n"
              "[BENCH]        texels: 1\n"
              "[BENCH]            Command 1: render (T)\n"
              "[BENCH]            Command 2: dilate (T)\n"
              "[BENCH]        Target 2: floor (T)\n"
              "[BENCH]    Pass 2: ao (T)\n"
              "[BENCH]        Target 1:  (T)\n"
              "[BENCH]            Command 1: render (T)\n");
    for (const auto &pass : stats.root().children) EXPECT_EQ(pass->timer.depth(), 0);
    ox::resetMessageFilters();
}

}  // namespace
