#include "tools/scene_summary_command.h"

#include <cstdio>

#include "app/config_run_settings.h"
#include "app/exit_status.h"
#include "app/run.h"
#include "config/settings_checks.h"
#include "core/message.h"
#include "platform/system.h"
#include "scene/load_settings.h"
#include "tools/run_checks.h"

namespace ox {

const char *const kInspectUsage =
    "Usage: thevorn-inspect <scene inputs...> [-x config.xml]\n"
    "       thevorn-inspect --help\n"
    "  Loads the scene files (.xml) and temporary mesh files (.vtm) as a run would and prints\n"
    "  a summary: shapes, instances, materials, cameras, lights, light links, box and bias.\n"
    "  With -x it also checks the configuration against the scene, one line per finding: the\n"
    "  bake targets' instances and UV sets, the camera, the lights. Exit status 0 when the scene\n"
    "  loads and a run would proceed, 1 when it would not, 2 for a bad command line, 3 when the\n"
    "  configuration cannot be loaded.\n";

bool parseInspectCommand(const std::vector<std::string> &args, InspectCommand &command,
                         std::string &error) {
    command = InspectCommand();
    for (size_t i = 0; i < args.size(); ++i) {
        const std::string &a = args[i];
        if (a == "--help" || a == "-h") {
            command.help = true;
            return true;
        } else if (a == "-x") {
            if (i + 1 >= args.size()) {
                error = "-x needs a configuration file";
                return false;
            }
            if (!command.configFile.empty()) {
                error = "-x given twice";
                return false;
            }
            command.configFile = args[++i];
        } else if (!a.empty() && a[0] == '-') {
            error = "Unknown option " + a;
            return false;
        } else {
            command.inputs.push_back(a);
        }
    }
    if (command.inputs.empty()) {
        error = "No scene inputs given";
        return false;
    }
    return true;
}

namespace {

const char *cameraKind(const Camera &c) {
    if (dynamic_cast<const PerspectiveCamera *>(&c)) return "perspective";
    if (dynamic_cast<const OrthoCamera *>(&c)) return "orthographic";
    if (dynamic_cast<const EnvCamera *>(&c)) return "environment";
    return "camera";
}

std::string shellWord(const std::string &s) {
    if (!s.empty() && s.find_first_not_of("abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ"
                                          "0123456789_-./+=:,") == std::string::npos)
        return s;
    std::string q = "'";
    for (char c : s) q += c == '\'' ? std::string("'\\''") : std::string(1, c);
    return q + "'";
}

/// The last line of the output: one plain sentence of what the user can do next.
std::string nextStep(const InspectCommand &command, const Scene &scene,
                     const std::vector<RunFinding> *findings, const std::string &missingDriver) {
    std::string inputs;
    for (const std::string &in : command.inputs) inputs += " " + shellWord(in);
    if (!findings) {
        if (scene.lights().empty())
            return "Next: the scene has no lights; add one (README, \"Adding lights\"), then check "
                   "a configuration against the scene with: thevorn-inspect" +
                   inputs + " -x <configuration.xml>\n";
        return "Next: check a configuration against the scene with: thevorn-inspect" + inputs +
               " -x <configuration.xml>\n";
    }
    if (!runWouldProceed(*findings))
        return "Next: mend the configuration where the lines marked error say, then inspect "
               "again.\n";
    if (!missingDriver.empty())
        return "Next: nothing more to check here, but this build has no driver for the " +
               missingDriver + " yet (thevorn would stop with status 4).\n";
    return "Next: run it with: thevorn" + inputs + " -x " + shellWord(command.configFile) +
           " -od out/\n";
}

}  // namespace

std::string sceneSummary(const Scene &scene) {
    std::string s;
    s += formatText("Shapes: %zu\n", scene.shapes().size());
    for (const auto &shape : scene.shapes()) {
        const VertexList &v = shape->vertices();
        s += "  " + shape->name() +
             formatText(": %u triangles, %u vertices, %u UV sets", shape->triangleCount(), v.size(),
                        v.uvSetCount());
        for (size_t k = 0; k < v.uvSetNames().size(); ++k)
            s += (k == 0 ? " (" : ", ") + v.uvSetNames()[k] +
                 (k + 1 == v.uvSetNames().size() ? ")" : "");
        if (v.hasColors()) s += ", vertex colours";
        s += "\n";
    }
    s += formatText("Instances: %zu\n", scene.instances().size());
    for (const auto &inst : scene.instances()) {
        s += "  " + inst->name() + ": shape " + inst->shape().name();
        if (inst->overrideMaterial())
            s += ", material " + materialOf(inst->overrideMaterial())->name();
        s += formatText(", flags 0x%05X\n", inst->flags());
    }
    const auto materials = scene.materials().materials();
    s += formatText("Materials: %zu\n", materials.size());
    for (const Material *m : materials) s += "  " + m->name() + "\n";
    s += formatText("Cameras: %zu\n", scene.cameras().size());
    for (const auto &c : scene.cameras()) {
        const Vec3 p = c->position();
        s += "  " + c->name() +
             formatText(": %s at (%g, %g, %g)\n", cameraKind(*c), double(p.x), double(p.y),
                        double(p.z));
    }
    s += formatText("Lights: %zu\n", scene.lights().size());
    for (const auto &l : scene.lights()) s += "  " + l->name() + ": " + l->className() + "\n";
    const LightLinkTable &links = scene.lightLinks();
    s += formatText("Light links: %u instances x %u lights (%zu bytes)\n", links.instanceCount(),
                    links.lightCount(), links.sizeBytes());
    const BBox box = scene.instanceBounds();
    if (box.isEmpty())
        s += "Scene box: empty\n";
    else
        s += formatText("Scene box: (%g, %g, %g) - (%g, %g, %g)\n", double(box.min.x),
                        double(box.min.y), double(box.min.z), double(box.max.x), double(box.max.y),
                        double(box.max.z));
    s += formatText("Bias: %g\n", double(scene.bias()));
    return s;
}

int32_t runInspect(const InspectCommand &command, std::string &summary) {
    ConfigRunSettings settings;
    if (!command.configFile.empty() && !settings.load(command.configFile)) {
        message(kMsgError, 6, "Unable to load settings from file %s", command.configFile.c_str());
        return kStatusConfigLoad;
    }
    OutputVerbosityFlags flags = settings.outputVerbosity();
    flags.debugFile = false;  // inspecting writes no files
    applyOutputVerbosity(flags, "");
    const int64_t threads = resolveRenderThreads(-1, settings, processorCount());
    Scene scene;
    std::string error;
    if (!loadScene(command.inputs, settings.config(), int(threads), scene, error)) {
        messageText(kMsgError, 6, "Unable to load the scene: " + error);
        return kStatusFailure;
    }
    summary = sceneSummary(scene);
    if (command.configFile.empty()) {
        summary += nextStep(command, scene, nullptr, "");
        return kStatusSuccess;
    }
    const std::vector<RunFinding> findings = checkRunAgainstScene(settings.config(), scene);
    summary += "Checks against " + command.configFile + ":\n" + formatFindings(findings);
    const int32_t action = resolveAction(kActionNone, settings);
    const RunEnvironment environment = defaultRunEnvironment();
    const RunDriverInterface *driver = environment.drivers.find(action);
    const std::string missingDriver =
        driver && driver->supports(action) ? "" : describeRunAction(action, {});
    summary += nextStep(command, scene, &findings, missingDriver);
    return runWouldProceed(findings) ? kStatusSuccess : kStatusFailure;
}

}  // namespace ox
