#include <cstdio>
#include <string>
#include <vector>

#include "app/exit_status.h"
#include "core/message.h"
#include "tools/scene_summary_command.h"

int main(int argc, char **argv) {
    std::vector<std::string> args(argv + 1, argv + argc);
    ox::InspectCommand command;
    std::string error;
    if (!ox::parseInspectCommand(args, command, error)) {
        ox::messageText(ox::kMsgError, 6, error);
        std::fputs(ox::kInspectUsage, stdout);
        return ox::processExitCode(ox::kStatusSyntaxError);
    }
    if (command.help) {
        std::fputs(ox::kInspectUsage, stdout);
        return 0;
    }
    std::string summary;
    const int32_t status = ox::runInspect(command, summary);
    std::fputs(summary.c_str(), stdout);
    return ox::processExitCode(status);
}
