#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "core/message.h"
#include "core/render_io.h"
#include "platform/thread.h"

/// Commands of a target's command list (render, post filter, output...) and the executor
/// that runs them in order with timing and abort-on-first-failure.
namespace ox {

class Frame;
class RenderContext;

/// One command of a command list.
class CommandInterface {
public:
    /// A command named name; runAfterFailure makes it run even after an earlier command
    /// failed; its success line is logged with messageType.
    explicit CommandInterface(std::string name, bool runAfterFailure = false,
                              uint32_t messageType = kMsgInfo)
        : name_(std::move(name)), runAfterFailure_(runAfterFailure), messageType_(messageType) {}
    virtual ~CommandInterface() = default;

    /// Runs the command; false on failure (after one message). The base reports that the
    /// command has no such form and fails.
    virtual bool execute(RenderIOInterface &io);

    /// The command's name, used in the log lines.
    const std::string &name() const { return name_; }
    /// True when the command runs even after an earlier command failed.
    bool runsAfterFailure() const { return runAfterFailure_; }
    /// Sets whether the command runs after an earlier failure.
    void setRunAfterFailure(bool on) { runAfterFailure_ = on; }
    /// The message type of the success line.
    uint32_t messageType() const { return messageType_; }
    /// Sets the message type of the success line.
    void setMessageType(uint32_t type) { messageType_ = type; }

private:
    std::string name_;
    bool runAfterFailure_;
    uint32_t messageType_;
};

/// A command that works on the frame being rendered.
class FrameCommand : public CommandInterface {
public:
    using CommandInterface::CommandInterface;
    using CommandInterface::execute;
    /// Runs the command on frame; false on failure (after one message).
    virtual bool execute(Frame &frame, RenderContext &context, RenderIOInterface &io) = 0;
};

/// Runs an ordered list of commands. After a failure the remaining commands are skipped,
/// except those marked to run anyway.
class CommandExecutor {
public:
    /// Appends a command (null is ignored); the executor owns it.
    void add(std::unique_ptr<CommandInterface> command);
    /// The number of commands.
    size_t size() const { return commands_.size(); }

    /// Runs the list with execute(io); returns false when a command failed.
    bool execute(RenderIOInterface &io);
    /// Runs the list on a frame: frame commands get execute(frame, context, io), the others
    /// execute(io). Returns false when a command failed.
    bool execute(Frame &frame, RenderContext &context, RenderIOInterface &io);

    /// True when a command of the last run failed.
    bool failed() const { return failed_; }
    /// The name of the first command that failed in the last run (empty when none).
    const std::string &failedCommand() const { return failedCommand_; }

private:
    bool runList(RenderIOInterface &io, Frame *frame, RenderContext *context);

    std::vector<std::unique_ptr<CommandInterface>> commands_;
    std::string failedCommand_;
    bool failed_ = false;
};

/// Runs the frame form of a command list on its own thread; the caller waits in join.
class RenderCmdThread final : public OXThread {
public:
    /// The executor, frame, context and io must outlive the thread.
    RenderCmdThread(CommandExecutor &executor, Frame &frame, RenderContext &context,
                    RenderIOInterface &io)
        : executor_(executor), frame_(frame), context_(context), io_(io) {}
    ~RenderCmdThread() override { join(); }
    std::string name() const override { return "Vendrel plugin render thread"; }
    /// The executor's result, valid after join.
    bool succeeded() const { return ok_; }

private:
    void run() override { ok_ = executor_.execute(frame_, context_, io_); }

    CommandExecutor &executor_;
    Frame &frame_;
    RenderContext &context_;
    RenderIOInterface &io_;
    bool ok_ = false;
};

}  // namespace ox
