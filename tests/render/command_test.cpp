#include "render/command.h"

#include <gtest/gtest.h>

#include <stdexcept>
#include <thread>

#include "tests/render/fake_io.h"

namespace {

class TestCommand : public ox::FrameCommand {
public:
    enum Kind { kOk, kFail, kThrow, kBaseForm };
    TestCommand(std::string name, Kind kind, std::vector<std::string> &log, bool runAfter = false)
        : ox::FrameCommand(std::move(name), runAfter), kind_(kind), log_(log) {}

    bool execute(ox::RenderIOInterface &io) override {
        if (kind_ == kBaseForm) return ox::CommandInterface::execute(io);
        return act("io");
    }
    bool execute(ox::Frame &, ox::RenderContext &, ox::RenderIOInterface &) override {
        threadId = std::this_thread::get_id();
        return act("frame");
    }
    std::thread::id threadId;

private:
    bool act(const char *form) {
        log_.push_back(name() + " " + form);
        if (kind_ == kThrow) throw std::runtime_error("disk full");
        return kind_ == kOk;
    }
    Kind kind_;
    std::vector<std::string> &log_;
};

// Frame and render context are opaque to the executor; the commands here never touch them.
alignas(16) unsigned char gStorage[16];
ox::Frame &fakeFrame() { return *reinterpret_cast<ox::Frame *>(gStorage); }
ox::RenderContext &fakeContext() { return *reinterpret_cast<ox::RenderContext *>(gStorage); }

TEST(CommandTest, FailureSkipsTheRestExceptMarkedCommandsAndKeepsTheFirst) {
    std::vector<std::string> log;
    ox::CommandExecutor ex;
    ex.add(std::make_unique<TestCommand>("render", TestCommand::kOk, log));
    ex.add(std::make_unique<TestCommand>("filter", TestCommand::kFail, log));
    ex.add(std::make_unique<TestCommand>("dilate", TestCommand::kOk, log));
    ex.add(std::make_unique<TestCommand>("output", TestCommand::kOk, log, true));
    ex.add(std::make_unique<TestCommand>("base", TestCommand::kBaseForm, log, true));
    ex.add(std::make_unique<TestCommand>("thrower", TestCommand::kThrow, log, true));
    ex.add(nullptr);
    EXPECT_EQ(ex.size(), 6u);
    oxtest::FakeIO io;
    testing::internal::CaptureStdout();
    EXPECT_FALSE(ex.execute(io));
    std::string out = testing::internal::GetCapturedStdout();
    EXPECT_EQ(log, (std::vector<std::string>{"render io", "filter io", "output io", "thrower io"}));
    EXPECT_TRUE(ex.failed());
    EXPECT_EQ(ex.failedCommand(), "filter");
    EXPECT_EQ(out.find("command dilate"), std::string::npos);
    for (const char *line :
         {"[INFO]     Successfully executed command render (execution time 00:00:00.",
          "[ERROR]    Error executing command filter, aborting\n",
          "Successfully executed command output",
          "[ERROR]    ::execute(RenderIOInterface& io) not implemented for base\n",
          "Command thrower failed: disk full", "Error executing command thrower, aborting"})
        EXPECT_NE(out.find(line), std::string::npos) << line << "\n" << out;
    EXPECT_EQ(io.events, (std::vector<std::string>{"title render", "begin", "end", "title filter",
                                                   "begin", "end", "title output", "begin", "end",
                                                   "title base", "begin", "end", "title thrower",
                                                   "begin", "end", "finish"}));
}

TEST(CommandTest, CommandThreadRunsTheFrameForm) {
    std::vector<std::string> log;
    ox::CommandExecutor ex;
    auto cmd = std::make_unique<TestCommand>("bake", TestCommand::kOk, log);
    TestCommand *raw = cmd.get();
    ex.add(std::move(cmd));
    oxtest::FakeIO io;
    ox::RenderCmdThread thread(ex, fakeFrame(), fakeContext(), io);
    testing::internal::CaptureStdout();
    ASSERT_TRUE(thread.start());
    thread.join();
    testing::internal::GetCapturedStdout();
    EXPECT_TRUE(thread.succeeded());
    EXPECT_EQ(log, (std::vector<std::string>{"bake frame"}));
    EXPECT_NE(raw->threadId, std::this_thread::get_id());
}

}  // namespace
