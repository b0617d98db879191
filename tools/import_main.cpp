#include <unistd.h>

#include <cstdio>
#include <string>
#include <vector>

#include "core/message.h"
#include "tools/import_command.h"

namespace {

// One line rewritten in place on a terminal, a line per tenth otherwise.
void showProgress(float share) {
    static int last = -1;
    const bool tty = isatty(fileno(stderr));
    int percent = int(share * 100.0f + 0.5f);
    if (percent == last || (!tty && percent / 10 == last / 10 && percent != 100)) return;
    last = percent;
    std::fprintf(stderr, tty ? "\rReading model: %3d%%" : "Reading model: %3d%%\n", percent);
    if (tty && percent >= 100) std::fputc('\n', stderr);
    std::fflush(stderr);
}

}  // namespace

int main(int argc, char **argv) {
    std::vector<std::string> args(argv + 1, argv + argc);
    ox::ImportCommand command;
    bool help = false;
    if (!ox::parseImportCommand(args, command, help) || help) {
        for (const std::string &line : ox::importUsage()) ox::consoleLine(line);
        return help ? ox::kImportOk : ox::kImportUsage;
    }
    const uint64_t limit =
        command.maxMemoryBytes ? command.maxMemoryBytes : ox::defaultImportMemoryLimit();
    if (!ox::applyImportMemoryLimit(limit))
        ox::message(ox::kMsgWarning, 6, "Cannot limit the memory of the import to %llu MiB",
                    (unsigned long long)(limit >> 20));
    return ox::runImport(command, showProgress);
}
