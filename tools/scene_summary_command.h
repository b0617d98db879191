#pragma once

#include <string>
#include <vector>

#include "scene/scene.h"

namespace ox {

/// What thevorn-inspect was asked for.
struct InspectCommand {
    std::vector<std::string> inputs;  ///< scene documents and mesh files, in order
    std::string configFile;           ///< -x (empty: the default configuration)
    bool help = false;                ///< --help: print the usage and stop
};

/// The usage text of thevorn-inspect.
extern const char *const kInspectUsage;

/// Reads the arguments (without the program name); false (with the reason) on a syntax error.
bool parseInspectCommand(const std::vector<std::string> &args, InspectCommand &command,
                         std::string &error);

/// Loads the scene as a run does (configuration, thread count, loader, messages) and returns
/// the run's status; on success summary receives the text to print: the scene summary, the
/// checks of the configuration against the scene when one was given, and one line of what to
/// do next. A check that would stop the run makes the status a general failure (the text is
/// still given).
int32_t runInspect(const InspectCommand &command, std::string &summary);

/// The summary of a loaded scene: shapes, instances, materials, cameras, lights, the light-link
/// table, the scene box and the bias.
std::string sceneSummary(const Scene &scene);

}  // namespace ox
