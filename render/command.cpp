#include "render/command.h"

#include <exception>

#include "core/timer.h"

namespace ox {

bool CommandInterface::execute(RenderIOInterface &) {
    messageText(kMsgError, 6, "::execute(RenderIOInterface& io) not implemented for " + name_);
    return false;
}

void CommandExecutor::add(std::unique_ptr<CommandInterface> command) {
    if (command) commands_.push_back(std::move(command));
}

bool CommandExecutor::execute(RenderIOInterface &io) { return runList(io, nullptr, nullptr); }

bool CommandExecutor::execute(Frame &frame, RenderContext &context, RenderIOInterface &io) {
    return runList(io, &frame, &context);
}

bool CommandExecutor::runList(RenderIOInterface &io, Frame *frame, RenderContext *context) {
    failedCommand_.clear();
    failed_ = false;
    bool &failed = failed_;
    for (auto &command : commands_) {
        Timer timer;
        timer.start(true);
        if (failed && !command->runsAfterFailure()) continue;
        io.setProgressTitle(command->name());
        io.beginCommand();
        bool ok = false;
        // A command that throws (memory exhaustion, a library error) fails like one that
        // returns false; nothing escapes the executor.
        try {
            auto *frameCommand = frame ? dynamic_cast<FrameCommand *>(command.get()) : nullptr;
            ok = frameCommand ? frameCommand->execute(*frame, *context, io) : command->execute(io);
        } catch (const std::exception &e) {
            message(kMsgError, 6, "Command %s failed: %s", command->name().c_str(), e.what());
        } catch (...) {
            message(kMsgError, 6, "Command %s failed", command->name().c_str());
        }
        if (ok) {
            timer.stop();
            message(command->messageType(), 6,
                    "Successfully executed command %s (execution time %s)", command->name().c_str(),
                    timer.format().c_str());
        } else {
            message(kMsgError, 6, "Error executing command %s, aborting", command->name().c_str());
            if (!failed) failedCommand_ = command->name();
            failed = true;
        }
        io.endCommand();
    }
    io.finish();
    return !failed;
}

}  // namespace ox
