#pragma once

#include <string>
#include <vector>

#include "config/ox_config.h"
#include "scene/scene.h"

/// What thevorn-inspect checks when it is given a configuration: whether a run with that
/// configuration finds in the scene what it needs (bake targets, UV sets, the camera, lights).
namespace ox {

/// How much a finding matters.
enum class FindingLevel {
    kOk,       ///< what the run will use, as expected
    kNote,     ///< worth knowing; the run goes on
    kWarning,  ///< the run goes on, but its result is probably not what was meant
    kError,    ///< the run stops, or a whole target gives nothing
};

/// One line of the check.
struct RunFinding {
    FindingLevel level = FindingLevel::kOk;
    std::string text;
};

/// Checks the configuration against the loaded scene.
std::vector<RunFinding> checkRunAgainstScene(const OXConfig &config, const Scene &scene);

/// True when no finding stops the run.
bool runWouldProceed(const std::vector<RunFinding> &findings);

/// The findings as text, one line each ("  error    ...").
std::string formatFindings(const std::vector<RunFinding> &findings);

}  // namespace ox
