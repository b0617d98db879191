#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

namespace ox {

/// The actions a run can take; the numbers are the internal action codes.
enum Action : int32_t {
    kActionNone = 0,              ///< the kind named by the configuration's renderType
    kActionRender = 1,            ///< -r camera render
    kActionTextureBake = 2,       ///< -b texture bake
    kActionSurfaceTransfer = 3,   ///< -s surface transfer
    kActionVertexBake = 4,        ///< -vb vertex bake
    kActionVertexTransfer = 5,    ///< -vt vertex surface transfer
    kActionWriteConfig = 6,       ///< -c write "config.xml"
    kActionWriteSchema = 7,       ///< -xs write "config.xsd"
    kActionPointCloudMerge = 8,   ///< -pm
    kActionPointCloudMergeB = 9,  ///< -pmb, one parameter
    kActionBoundaryMerge = 10,    ///< -pmbo boundary-point merge
    kActionPathTracerMerge = 11,  ///< -pmpt path-tracer-cache merge
    kActionPointCloudBake = 16,   ///< -pb
    kActionRegionMerge = 17,      ///< -rm
    kActionSplitConfig = 18,      ///< -spl
    kActionUvPack = 19,           ///< -uvpack
    kActionImageMerge = 20,       ///< -im
};

/// Output image formats chosen on the command line (0 = from the configuration).
enum FileFormat : int32_t {
    kFormatNone = 0,           ///< take imageFormat from the configuration
    kFormatExr = 1,            ///< -e
    kFormatExrMultiLayer = 2,  ///< -me
    kFormatJpeg = 3,           ///< -j
    kFormatTga = 4,            ///< -t
    kFormatTga24 = 5,          ///< -t24 (no alpha)
};

/// Priority given with -p.
enum CommandLinePriority : int32_t {
    kCommandPriorityNone = 0,    ///< leave the process priority alone
    kCommandPriorityLow = 1,     ///< -p l
    kCommandPriorityNormal = 2,  ///< -p n
    kCommandPriorityHigh = 3,    ///< -p h
};

/// The parsed command line.
struct CommandLineOptions {
    bool quitWhenDone = false;                     ///< -q
    bool showDisplay = true;                       ///< cleared by -d and -n
    std::string patArgument;                       ///< -pat (read by no run)
    int32_t priority = kCommandPriorityNone;       ///< -p
    int32_t action = kActionNone;                  ///< the action options
    int32_t fileFormat = kFormatNone;              ///< the format options
    std::vector<std::string> inputFiles;           ///< plain arguments, then -i lists
    std::vector<std::string> inputListFiles;       ///< -i
    std::string outputDirectory;                   ///< -od, ends in "/" or "\\"
    std::string outputFile;                        ///< -o
    std::vector<std::string> configFiles;          ///< -x
    std::vector<std::string> imageListFiles;       ///< -ri
    std::vector<std::string> imageInputs;          ///< -rm, -im, then -ri lists
    std::vector<std::string> pointCloudListFiles;  ///< -pi
    std::vector<std::string> pointCloudInputs;     ///< -pm, -pmb, -pmbo, -pmpt, then -pi lists
    float mergeParam1 = 0.0f;                      ///< -pmb, -pmbo, -pmpt
    float mergeParam2 = 0.0f;                      ///< -pmpt
    std::string mergeTarget;                       ///< first argument of -rm / -im
    int64_t renderThreads = -1;                    ///< -rt (-1 = not given)
    int32_t splitCount = 0;                        ///< -spl
    bool crashSilently = false;                    ///< -cs
};

/// Reads an input list file (an "inputspecification" document) and appends its "filelist"
/// entries to out; false when the file cannot be loaded. Reports no message of its own.
using InputListLoader = std::function<bool(const std::string &file, std::vector<std::string> &out)>;

/// A loader for builds without a configuration reader: every list fails to load.
bool loadNoInputList(const std::string &file, std::vector<std::string> &out);

/// The usage text printed after every syntax error, each line ended by a line break.
extern const char *const kUsageText;

/// Parses args (args[0] is the program name) into options, printing each syntax message on its
/// own line to standard output; list files are expanded through loader. False on a syntax
/// error (the caller prints the usage).
bool parseCommandLine(const std::vector<std::string> &args, const InputListLoader &loader,
                      CommandLineOptions &options);

/// A short description of an action ("texture bake (-b)") for messages.
std::string describeAction(int32_t action);
/// The same for the action a run resolved: when no action option was given, the action came
/// from the configuration and the text names that setting ("texture bake (renderType
/// TextureBake)").
std::string describeRunAction(int32_t action, const CommandLineOptions &options);

}  // namespace ox
