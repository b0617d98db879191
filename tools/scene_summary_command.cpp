#include "tools/scene_summary_command.h"

#include <cstdio>

#include "app/config_run_settings.h"
#include "app/exit_status.h"
#include "app/run.h"
#include "config/settings_checks.h"
#include "core/message.h"
#include "platform/system.h"
#include "scene/load_settings.h"

namespace ox {

const char *const kInspectUsage =
    "Usage: thevorn-inspect <scene inputs...> [-x config.xml]\n"
    "  Loads the scene files (.xml) and temporary mesh files (.vtm) as a run would and prints\n"
    "  a summary: shapes, instances, materials, cameras, lights, light links, box and bias.\n";

bool parseInspectCommand(const std::vector<std::string> &args, InspectCommand &command,
                         std::string &error) {
    command = InspectCommand();
    for (size_t i = 0; i < args.size(); ++i) {
        const std::string &a = args[i];
        if (a == "-x") {
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
    return kStatusSuccess;
}

}  // namespace ox
