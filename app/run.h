#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "app/command_line.h"
#include "app/run_driver.h"
#include "app/run_settings.h"

namespace ox {

/// What a run is built from: the configuration, the list reader, the drivers. Later
/// subsystems plug their implementations in through defaultRunEnvironment().
struct RunEnvironment {
    /// Makes a configuration holding every default.
    std::function<std::unique_ptr<RunSettingsInterface>()> makeSettings;
    /// Reads -i, -pi and -ri list files.
    InputListLoader loadInputList = loadNoInputList;
    /// The drivers by action.
    DriverTable drivers;
    /// The logical processor count (replaceable in tests).
    std::function<int()> processorCount;
};

/// The environment of this build: every subsystem that is present is plugged in here.
RunEnvironment defaultRunEnvironment();

/// The whole run: banner, command line, configuration, output tree, drivers, summaries.
/// args[0] is the program name. Returns the run status (see app/exit_status.h).
int32_t runThevorn(const std::vector<std::string> &args, const RunEnvironment &environment);

/// Turns the silent crash handling of -cs on (every fault ends the process with exit code 139
/// and no core dump) or restores the default handling.
void installCrashHandler(bool crashSilently);

/// The action that runs: the option's, written back into renderType, or the one that
/// renderType names (kActionNone when it names none). Sets fgUseLegacy for vertex and
/// point-cloud bakes.
int32_t resolveAction(int32_t action, RunSettingsInterface &settings);

/// The render thread count (1 to 1024) from -rt (-1 = not given) or the configuration, stored
/// back into renderThreads; reports the detected cores or a clamped count.
int64_t resolveRenderThreads(int64_t commandLineThreads, RunSettingsInterface &settings,
                             int processors);

/// The output format: the option's, or the one imageFormat maps to.
int32_t resolveFileFormat(int32_t fileFormat, int32_t imageFormat);

/// Creates the output directory and its GI subdirectories and prefixes the GI cache file
/// names; returns 0 or the failure status (reported).
int32_t prepareOutputTree(const std::string &outputDirectory, RunSettingsInterface &settings);

/// Checks the settings and input files of a scene action; returns 0 or the failure status
/// (reported).
int32_t checkInputs(int32_t action, const RunSettingsInterface &settings);

}  // namespace ox
