#include "platform/work_server.h"

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <sstream>
#include <thread>
#include <vector>

namespace {

/// Counts runs, destructions and the threads seen; fails when asked to.
struct Counters {
    std::atomic<int> runs{0}, deleted{0}, badIndex{0}, sawStop{0};
};

/// Sleeps (until stopped) or waits for a gate to open, then counts its run.
class CountingWork : public ox::Work {
public:
    CountingWork(Counters &c, int threads, bool fail = false, int sleepMs = 0,
                 const std::atomic<bool> *gate = nullptr)
        : c_(c), threads_(threads), fail_(fail), sleepMs_(sleepMs), gate_(gate) {}
    ~CountingWork() override { ++c_.deleted; }
    bool run(const std::atomic<bool> &stop, int index) override {
        if (index < 0 || index >= threads_) ++c_.badIndex;
        for (int i = 0; (i < sleepMs_ && !stop.load()) || (gate_ && !gate_->load()); ++i)
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        if (stop.load()) ++c_.sawStop;
        ++c_.runs;
        if (fail_) setError("item " + std::to_string(c_.runs.load()) + " failed");
        return !fail_;
    }

private:
    Counters &c_;
    int threads_;
    bool fail_;
    int sleepMs_;
    const std::atomic<bool> *gate_;
};

/// The progress lines (without their prefix) that waiting for the server prints.
std::vector<std::string> waitForProgress(ox::WorkServer &server, float sleepSeconds, float step) {
    testing::internal::CaptureStdout();
    server.waitWithProgress(sleepSeconds, step);
    std::vector<std::string> lines;
    std::istringstream in(testing::internal::GetCapturedStdout());
    for (std::string line; std::getline(in, line);)
        if (line.rfind("[PROGRESS] ", 0) == 0) lines.push_back(line.substr(11));
    return lines;
}

TEST(WorkServerTest, ManyThreadsFailingItemsAllRunOnce) {
    constexpr int kThreads = 8, kItems = 3000;  // more threads than cores
    Counters c;
    {
        ox::WorkServer server(kThreads);
        for (int i = 0; i < kItems / 2; ++i)
            server.addWork(new CountingWork(c, kThreads, i % 7 == 3));
        EXPECT_EQ(server.state(), ox::WorkServer::kRunning);
        server.start();
        for (int i = kItems / 2; i < kItems; ++i)  // added while the workers run
            server.addWork(std::make_unique<CountingWork>(c, kThreads, i % 7 == 3));
        auto lines = waitForProgress(server, 0.001f, 0.1f);
        ASSERT_FALSE(lines.empty());
        EXPECT_EQ(lines.back(), "Progress: 100%");
        int last = 0;
        for (auto &l : lines) {  // strictly increasing marks, each at most once
            int p = std::stoi(l.substr(10));
            EXPECT_GT(p, last) << l;
            EXPECT_EQ(p % 10, 0) << l;
            last = p;
        }
        EXPECT_EQ(server.state(), ox::WorkServer::kFinished);
        EXPECT_EQ(c.runs.load(), kItems);
        EXPECT_EQ(c.deleted.load(), kItems);
        std::string msg;
        ASSERT_TRUE(server.failed(msg));
        EXPECT_NE(msg.find(" failed (and "), std::string::npos) << msg;
        EXPECT_NE(msg.find(" more failures)"), std::string::npos) << msg;

        // A finished server takes new work again and counts from zero. The marks printed
        // before 100% depend on when the item ends, so only the last line is checked.
        server.addWork(new CountingWork(c, kThreads));
        lines = waitForProgress(server, 0.001f, 0.3f);
        ASSERT_FALSE(lines.empty());
        EXPECT_EQ(lines.back(), "Progress: 100%");
    }
    EXPECT_EQ(c.badIndex.load(), 0);
    EXPECT_EQ(c.runs.load(), kItems + 1);
}

TEST(WorkServerTest, QueuedWorkDoesNotWaitForTheSlowestItem) {
    std::atomic<bool> open{false};
    Counters c, gated;
    ox::WorkServer server(2);
    server.addWork(new CountingWork(gated, 2, false, 0, &open));
    server.start();
    std::this_thread::sleep_for(std::chrono::milliseconds(5));
    for (int i = 0; i < 200; ++i) server.addWork(new CountingWork(c, 2));
    // One worker is held by the gate; the other must get through every quick item.
    auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(60);
    while (c.runs.load() < 200 && std::chrono::steady_clock::now() < deadline)
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    EXPECT_EQ(c.runs.load(), 200);
    EXPECT_EQ(server.state(), ox::WorkServer::kRunning);  // the gate item is still busy
    open = true;
    waitForProgress(server, 0.01f, 0.5f);
    EXPECT_EQ(server.state(), ox::WorkServer::kFinished);
}

TEST(WorkServerTest, ShutdownMidRunStopsAndDeletesEverything) {
    Counters c;
    {
        ox::WorkServer server(4);
        for (int i = 0; i < 400; ++i) server.addWork(new CountingWork(c, 4, false, 5000));
        server.start();
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }  // destroyed while items run and many are queued
    EXPECT_EQ(c.deleted.load(), 400);
    EXPECT_LT(c.runs.load(), 400);
    // Every item that ran was cut short by the stop flag (each would take 5 s otherwise).
    EXPECT_EQ(c.sawStop.load(), c.runs.load());

    // Destroying a server that never started is clean too.
    Counters idle;
    {
        ox::WorkServer server(2);
        server.addWork(new CountingWork(idle, 2));
    }
    EXPECT_EQ(idle.deleted.load(), 1);
    EXPECT_EQ(idle.runs.load(), 0);
}

TEST(WorkServerTest, NonThreadedServerRunsOnTheCallerAndNoWorkPrintsOneLine) {
    ox::WorkServer idle(3);
    idle.start();
    EXPECT_EQ(waitForProgress(idle, 0.05f, 0.1f), std::vector<std::string>{"Progress: 100%"});
    std::string msg;
    EXPECT_FALSE(idle.failed(msg));

    Counters c;
    ox::WorkServer server(4, false);
    for (int i = 0; i < 10; ++i) server.addWork(new CountingWork(c, 1, i == 4));
    EXPECT_EQ(waitForProgress(server, 0.05f, 0.25f),
              (std::vector<std::string>{"Progress: 25%", "Progress: 50%", "Progress: 75%",
                                        "Progress: 100%"}));
    EXPECT_EQ(c.runs.load(), 10);
    ASSERT_TRUE(server.failed(msg));
    EXPECT_EQ(msg, "item 5 failed");
}

}  // namespace
