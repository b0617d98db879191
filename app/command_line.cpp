#include "app/command_line.h"

#include <locale>
#include <sstream>

#include "core/message.h"

namespace ox {

const char *const kUsageText =
    "thevorn <scene.xml> -o <outfile> -x <configuration.xml>\n"
    "-r forces camera rendering\n"
    "-b forces texture baking\n"
    "-s forces surface transfer\n"
    "-vb forces vertex baking\n"
    "-vt forces vertex surface transfer\n"
    "-pb forces point cloud baking\n"
    "-uvpack forces uv-packing\n"
    "\n"
    "outfile is a base filename for the generated images (extension will be added).\n"
    "It will use open exr format by default.\n"
    "-j generate jpeg files\n"
    "-t generate tga files\n"
    "-t24 generate 24bit tga files (no alpha)\n"
    "-e generate exr files\n"
    "-me generate multi layer exr files\n"
    "-c generates a default configuration xml (config.xml)\n"
    "-xs generates an xml schema for configuration file validation (config.xsd)\n"
    "-d disables display of the rendered result\n"
    "-q makes vorn terminate after it's done rather than keep showing the\n"
    "   final result.\n"
    "-od sets the output directory\n"
    "-p sets priority for the Vorn process, h for high, n for normal, l for low\n"
    "-rt forces the number of renderthreads, requires a parameter\n"
    "-rm merges regions into one image\n"
    "-im merges multiple images into one image\n"
    "\n"
    "-i <file> specifies an xml file listing extra input files.\n"
    "    More than one -i parameter is supported.\n"
    "-pi <file> specifies an xml file listing extra point cloud input files for merge "
    "commands.\n"
    "    More than one -pi parameter is supported.\n"
    "-ri <file> specifies an xml file listing extra image input files for merge commands.\n"
    "    More than one -ri parameter is supported.\n";

bool loadNoInputList(const std::string &, std::vector<std::string> &) { return false; }

namespace {

bool isOption(const std::string &arg) { return !arg.empty() && arg[0] == '-'; }

/// Reads a number the way stream extraction does (leading blanks skipped, trailing text
/// ignored), independent of the global locale.
template <typename T>
bool readNumber(const std::string &text, T &value) {
    std::istringstream in(text);
    in.imbue(std::locale::classic());
    T v{};
    if (!(in >> v)) return false;
    value = v;
    return true;
}

bool syntaxError(const std::string &text) {
    consoleLine(text);
    return false;
}

class Parser {
public:
    Parser(const std::vector<std::string> &args, CommandLineOptions &o) : args_(args), o_(o) {}

    bool parseArguments() {
        for (i_ = 1; i_ < args_.size(); ++i_) {
            const std::string &arg = args_[i_];
            if (!isOption(arg)) {
                o_.inputFiles.push_back(arg);
                continue;
            }
            if (!parseOption(arg.substr(1))) return false;
        }
        return true;
    }

    bool sceneRequired = true;
    bool imageMergeChosen = false;
    bool pointCloudMergeChosen = false;
    int actions = 0;
    int formats = 0;
    std::string mergeName;

private:
    bool hasArgument() const { return i_ + 1 < args_.size() && !isOption(args_[i_ + 1]); }
    const std::string &next() { return args_[++i_]; }
    void consume(std::vector<std::string> &into) {
        while (hasArgument()) into.push_back(next());
    }
    void setAction(int32_t action) {
        o_.action = action;
        ++actions;
    }
    void setFormat(int32_t format) {
        o_.fileFormat = format;
        ++formats;
    }
    void pointCloudMerge(const std::string &name, int32_t action, int leadingNumbers) {
        setAction(action);
        float *params[2] = {&o_.mergeParam1, &o_.mergeParam2};
        for (int k = 0; k < leadingNumbers && hasArgument(); ++k) {
            float value = 0.0f;
            readNumber(next(), value);  // an unreadable parameter reads as 0
            *params[k] = value;
        }
        consume(o_.pointCloudInputs);
        pointCloudMergeChosen = true;
        sceneRequired = false;
        mergeName = name;
    }
    void imageMerge(const std::string &name, int32_t action) {
        setAction(action);
        if (hasArgument()) o_.mergeTarget = next();
        consume(o_.imageInputs);
        imageMergeChosen = true;
        mergeName = name;
    }
    bool listOption(const std::string &name, std::vector<std::string> &into) {
        if (!hasArgument()) return syntaxError("Syntax error, -" + name + " needs argument.");
        into.push_back(next());
        return true;
    }

    bool parseOption(const std::string &name) {
        static const struct {
            const char *name;
            int32_t action;
        } kSimpleActions[] = {{"r", kActionRender},          {"b", kActionTextureBake},
                              {"s", kActionSurfaceTransfer}, {"vb", kActionVertexBake},
                              {"vt", kActionVertexTransfer}, {"pb", kActionPointCloudBake},
                              {"uvpack", kActionUvPack}};
        static const struct {
            const char *name;
            int32_t format;
        } kFormats[] = {{"e", kFormatExr},
                        {"me", kFormatExrMultiLayer},
                        {"j", kFormatJpeg},
                        {"t", kFormatTga},
                        {"t24", kFormatTga24}};
        for (const auto &a : kSimpleActions) {
            if (name == a.name) {
                setAction(a.action);
                return true;
            }
        }
        for (const auto &f : kFormats) {
            if (name == f.name) {
                setFormat(f.format);
                return true;
            }
        }
        if (name == "x") {
            const size_t before = o_.configFiles.size();
            consume(o_.configFiles);
            if (o_.configFiles.size() == before)
                return syntaxError("Syntax error, -x needs argument.");
            return true;
        }
        if (name == "c" || name == "xs") {
            setAction(name == "c" ? kActionWriteConfig : kActionWriteSchema);
            sceneRequired = false;
            return true;
        }
        if (name == "cs") {
            o_.crashSilently = true;
            return true;
        }
        if (name == "pm") {
            pointCloudMerge(name, kActionPointCloudMerge, 0);
            return true;
        }
        if (name == "pmb" || name == "pmbo") {
            pointCloudMerge(name, name == "pmb" ? kActionPointCloudMergeB : kActionBoundaryMerge,
                            1);
            return true;
        }
        if (name == "pmpt") {
            pointCloudMerge(name, kActionPathTracerMerge, 2);
            return true;
        }
        if (name == "rm" || name == "im") {
            imageMerge(name, name == "rm" ? kActionRegionMerge : kActionImageMerge);
            return true;
        }
        if (name == "o") {
            if (!o_.outputFile.empty())
                return syntaxError("Syntax error, more than one output file specified");
            if (!hasArgument()) return syntaxError("Syntax error, -o needs argument.");
            o_.outputFile = next();
            return true;
        }
        if (name == "od") {
            if (!o_.outputDirectory.empty())
                return syntaxError("Syntax error, more than one output directory specified");
            // An empty directory would otherwise become "/", the root of the file system.
            if (!hasArgument() || args_[i_ + 1].empty())
                return syntaxError("Syntax error, -od needs argument.");
            o_.outputDirectory = next();
            const char last = o_.outputDirectory.back();
            if (last != '/' && last != '\\') o_.outputDirectory += '/';
            return true;
        }
        if (name == "d" || name == "n") {
            o_.showDisplay = false;
            return true;
        }
        if (name == "q") {
            o_.quitWhenDone = true;
            return true;
        }
        if (name == "spl") {
            int32_t count = 0;
            if (!hasArgument() || !readNumber(next(), count) || count <= 0)
                return syntaxError("Syntax error, -spl needs <num> argument.");
            o_.splitCount = count;
            setAction(kActionSplitConfig);
            sceneRequired = false;
            return true;
        }
        if (name == "pat") {
            if (!hasArgument()) return syntaxError("Syntax error, -pat needs argument.");
            o_.patArgument = next();
            return true;
        }
        if (name == "p") {
            if (!hasArgument()) return syntaxError("Syntax error, -p needs argument.");
            const std::string &letter = next();
            if (letter == "h")
                o_.priority = kCommandPriorityHigh;
            else if (letter == "n")
                o_.priority = kCommandPriorityNormal;
            else if (letter == "l")
                o_.priority = kCommandPriorityLow;
            else
                consoleLine("Syntax error, " + letter + " is not a valid priority (h, l or n).");
            return true;
        }
        if (name == "i") return listOption(name, o_.inputListFiles);
        if (name == "pi") return listOption(name, o_.pointCloudListFiles);
        if (name == "ri") return listOption(name, o_.imageListFiles);
        if (name == "rt") {
            if (!hasArgument()) return syntaxError("Syntax error, -rt needs argument.");
            const std::string &text = next();
            int64_t threads = -1;
            if (!readNumber(text, threads)) {
                consoleLine("Syntax error, " + text + " is not a valid input to -rt");
                threads = -1;
            }
            o_.renderThreads = threads;
            return true;
        }
        return syntaxError("Syntax error, unknown option -" + name);
    }

    const std::vector<std::string> &args_;
    CommandLineOptions &o_;
    size_t i_ = 1;
};

bool expandLists(const std::vector<std::string> &lists, const InputListLoader &loader,
                 std::vector<std::string> &into) {
    for (const std::string &file : lists) {
        std::vector<std::string> entries;
        if (!loader || !loader(file, entries)) {
            consoleLine("Unable to load input file list from file: " + file);
            return false;
        }
        into.insert(into.end(), entries.begin(), entries.end());
    }
    return true;
}

}  // namespace

bool parseCommandLine(const std::vector<std::string> &args, const InputListLoader &loader,
                      CommandLineOptions &options) {
    Parser parser(args, options);
    if (args.size() >= 2 && !parser.parseArguments()) return false;
    if (options.configFiles.size() > 1) return false;
    if (parser.actions > 1) return syntaxError("Syntax error, too many actions specified.");
    if (parser.formats > 1) return syntaxError("Syntax error, too many file formats specified.");
    if (!expandLists(options.inputListFiles, loader, options.inputFiles))
        return syntaxError("Unable to build list of input files.");
    if (!expandLists(options.pointCloudListFiles, loader, options.pointCloudInputs))
        return syntaxError("Unable to build list of point cloud input files.");
    if (!expandLists(options.imageListFiles, loader, options.imageInputs))
        return syntaxError("Unable to build list of image merge input files.");
    if (parser.imageMergeChosen && options.imageInputs.empty())
        return syntaxError("Syntax error, -" + parser.mergeName +
                           " needs at least one image to merge.");
    if (parser.pointCloudMergeChosen && options.pointCloudInputs.empty())
        return syntaxError("Syntax error, -" + parser.mergeName +
                           " needs at least one pointcloud to merge.");
    if (parser.sceneRequired && options.inputFiles.empty())
        return syntaxError(
            "Syntax error, the chosen command requires a scene but no input filename was "
            "specified.");
    return true;
}

std::string describeRunAction(int32_t action, const CommandLineOptions &options) {
    // The values of the configuration's renderType, by the action each selects.
    static const struct {
        int32_t action;
        const char *kind;
        const char *renderType;
    } kFromConfiguration[] = {
        {kActionRender, "camera render", "Render"},
        {kActionTextureBake, "texture bake", "TextureBake"},
        {kActionVertexBake, "vertex bake", "VertexBake"},
        {kActionSurfaceTransfer, "surface transfer", "SurfaceTransfer"},
        {kActionVertexTransfer, "vertex surface transfer", "VertexTransfer"},
        {kActionPointCloudBake, "point cloud bake", "PointCloudBake"},
    };
    if (options.action == kActionNone)
        for (const auto &c : kFromConfiguration)
            if (c.action == action)
                return std::string(c.kind) + " (renderType " + c.renderType + ")";
    return describeAction(action);
}

std::string describeAction(int32_t action) {
    switch (action) {
        case kActionNone:
            return "the configured run";
        case kActionRender:
            return "camera render (-r)";
        case kActionTextureBake:
            return "texture bake (-b)";
        case kActionSurfaceTransfer:
            return "surface transfer (-s)";
        case kActionVertexBake:
            return "vertex bake (-vb)";
        case kActionVertexTransfer:
            return "vertex surface transfer (-vt)";
        case kActionWriteConfig:
            return "default configuration (-c)";
        case kActionWriteSchema:
            return "configuration schema (-xs)";
        case kActionPointCloudMerge:
            return "point cloud merge (-pm)";
        case kActionPointCloudMergeB:
            return "point cloud merge (-pmb)";
        case kActionBoundaryMerge:
            return "boundary point merge (-pmbo)";
        case kActionPathTracerMerge:
            return "path tracer cache merge (-pmpt)";
        case kActionPointCloudBake:
            return "point cloud bake (-pb)";
        case kActionRegionMerge:
            return "region merge (-rm)";
        case kActionSplitConfig:
            return "configuration split (-spl)";
        case kActionUvPack:
            return "uv packing (-uvpack)";
        case kActionImageMerge:
            return "image merge (-im)";
        default:
            return "action " + std::to_string(action);
    }
}

}  // namespace ox
