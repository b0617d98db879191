#include <cstdio>
#include <string>
#include <vector>

#include "app/exit_status.h"
#include "app/run.h"

int main(int argc, char **argv) {
    const std::vector<std::string> args(argv, argv + argc);
    const int32_t status = ox::runThevorn(args, ox::defaultRunEnvironment());
    std::fflush(stdout);
    return ox::processExitCode(status);
}
