#include <cstdio>
#include <string>
#include <vector>

#include "core/message.h"
#include "tools/ptc_command.h"

int main(int argc, char **argv) {
    std::vector<std::string> args(argv + 1, argv + argc);
    ox::PtcCommand command;
    std::string error;
    if (!ox::parsePtcCommand(args, command, error)) {
        ox::messageText(ox::kMsgError, 6, error);
        std::fputs(ox::kPtcUsageText, stdout);
        return ox::kPtcBadCommandLine;
    }
    if (command.action == ox::PtcCommand::Action::Help) {
        std::fputs(ox::kPtcUsageText, stdout);
        return ox::kPtcOk;
    }
    std::string out;
    const int status = ox::runPtc(command, out);
    std::fputs(out.c_str(), stdout);
    return status;
}
