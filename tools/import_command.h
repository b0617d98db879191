#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "tools/imported_model.h"
#include "tools/lightmap_uv.h"
#include "tools/model_reader.h"

/// The command of thevorn-import: options, listing and writing of the output directory.
namespace ox {

/// Exit statuses of thevorn-import.
enum ImportExitStatus : int {
    kImportOk = 0,
    kImportFailed = 1,          ///< the model could not be read or a file could not be written
    kImportUsage = 2,           ///< the command line was wrong
    kImportWouldOverwrite = 3,  ///< an output file exists and --force was not given
};

/// Everything the command line sets.
struct ImportCommand {
    std::string model;
    std::string outputDir;
    std::string sceneName;  ///< scene file name in outputDir; empty = the model's base name
    ImportOptions options;
    bool list = false;
    bool force = false;
    bool quiet = false;
    int progressMode = 0;        ///< 0 automatic (large files), 1 always, -1 never
    int lightmapResolution = 0;  ///< 0 = no light-map UVs are generated
    LightmapOptions lightmap;
    uint64_t maxMemoryBytes = 0;  ///< address space the import may use; 0 = the default
};

/// The smallest memory limit that can be asked for.
constexpr uint64_t kMinImportMemoryBytes = uint64_t(64) << 20;

/// The memory limit of an import when none is given: three quarters of the machine's memory.
uint64_t defaultImportMemoryLimit();

/// Limits the address space of the whole process to bytes, so that an allocation beyond it
/// fails (and ends the import with "out of memory") instead of exhausting the machine. Builds
/// with a sanitizer keep their own limits and are left alone. False when the limit cannot be
/// set.
bool applyImportMemoryLimit(uint64_t bytes);

/// Files larger than this get a progress line unless told otherwise.
constexpr uint64_t kProgressFileBytes = 32ull << 20;

/// Parses the arguments after the program name. False with one error message on bad input;
/// help is set when the user asked for the usage text.
bool parseImportCommand(const std::vector<std::string> &args, ImportCommand &command, bool &help);

/// The usage text, one line per entry.
std::vector<std::string> importUsage();

/// Adds a light-map UV set to every shape that has fewer than two sets (a shape without any
/// set gets the layout as its first set too). Reports charts, coverage and stretch per shape.
bool addLightmapUVs(ImportedModel &model, const LightmapOptions &options);

/// Lines describing the model for --list.
std::vector<std::string> describeModel(const ImportedModel &model);

/// Runs the whole command; progress, when given, receives the reading progress (0 to 1).
int runImport(const ImportCommand &command, const std::function<void(float)> &progress);

}  // namespace ox
