#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "pointcloud/point_cloud.h"

/// The command of thevorn-ptc: looking into point-cloud files and converting their encoding.
namespace ox {

/// Exit statuses of thevorn-ptc.
enum PtcExitStatus : int {
    kPtcOk = 0,
    kPtcFailed = 1,          ///< a file could not be read or written
    kPtcBadCommandLine = 2,  ///< the command line was wrong
};

/// Everything the command line sets.
struct PtcCommand {
    enum class Action { Info, Convert, Help };
    Action action = Action::Help;
    std::string input;
    std::string output;    ///< convert only
    uint64_t samples = 5;  ///< info: how many samples to print (--points)
};

/// The usage text.
extern const char *const kPtcUsageText;

/// Parses the arguments after the program name; false (with the reason) on a syntax error.
bool parsePtcCommand(const std::vector<std::string> &args, PtcCommand &command, std::string &error);

/// The header, the variables and the first `samples` samples of a cloud, as info prints them.
std::string pointCloudSummary(const PointCloud &cloud, uint64_t samples);

/// Runs the command; `out` receives what info prints. Returns kPtcOk or kPtcFailed (the
/// failure is reported through messages).
int runPtc(const PtcCommand &command, std::string &out);

}  // namespace ox
