#include "tools/run_checks.h"

#include <cmath>
#include <map>

#include "bake/bake_target.h"
#include "core/message.h"
#include "shading/phong.h"

namespace ox {

namespace {

std::string quoted(const std::string &s) { return "\"" + s + "\""; }

std::string plural(size_t n, const char *one, const char *many) {
    return formatText("%zu %s", n, n == 1 ? one : many);
}

std::string joined(const std::vector<std::string> &items) {
    std::string s;
    for (const std::string &item : items) s += (s.empty() ? "" : ", ") + item;
    return s;
}

/// True when the material gives light of its own (a texture or vertex colour counts).
bool isEmissive(const Material &material) {
    const auto *phong = dynamic_cast<const PhongShader *>(&material.surface());
    if (!phong) return false;
    const MaterialChannel &e = phong->parameters().channels[kPhongEmissive];
    if (e.scale <= 0.0f) return false;
    return !e.isConstant() || e.color.luminance() > 0.0f;
}

std::string renderTypeName(const FrameSettingsBase &frame) {
    std::string name;
    frame.renderType.toString(name);
    return name;
}

void checkTargets(const OXConfig &config, const Scene &scene, std::vector<RunFinding> &out) {
    const TextureBakeSettingsBase &bake = config.TextureBakeSettings;
    const Vec2i frame = config.FrameSettings.resolution();
    std::map<std::string, size_t> names;
    for (size_t t = 0; t < bake.targets.size(); ++t) {
        const BakeTextureTargetBase &target = bake.targets[t];
        const std::string name = target.textureName();
        const Vec2i base = target.hasResolutionOverride() ? target.resolutionOverride() : frame;
        const double w = std::floor(double(base.x) * double(bake.resolutionScale()));
        const double h = std::floor(double(base.y) * double(bake.resolutionScale()));
        if (!(w >= 1 && h >= 1 && w <= 65535 && h <= 65535)) {
            out.push_back({FindingLevel::kError,
                           formatText("target %s: %g x %g texels is not a size that can be baked",
                                      name.c_str(), w, h)});
            continue;
        }
        if (auto [it, fresh] = names.emplace(name, t); !fresh) {
            out.push_back(
                {FindingLevel::kError, "target " + name +
                                           ": another target has this textureName, so their "
                                           "files would overwrite each other"});
            continue;
        }
        std::vector<std::string> usable, skipped;
        for (size_t s = 0; s < target.targetSurfaces.size(); ++s) {
            const BakeShapeBase &shape = target.targetSurfaces[s];
            const Instance *instance = scene.findInstance(shape.target());
            if (!instance) {
                skipped.push_back("no instance is called " + quoted(shape.target()));
                continue;
            }
            const VertexList &vertices = instance->shape().vertices();
            const int set = bakeShapeUvSet(bake, shape, vertices);
            if (set < 0 || vertices.uvSetCount() == 0) {
                const std::string wanted = bakeShapeUvSetName(bake, shape);
                const std::string has = joined(vertices.uvSetNames());
                skipped.push_back("instance " + shape.target() +
                                  (wanted.empty() ? std::string(" has no UV set")
                                                  : " has no UV set " + quoted(wanted)) +
                                  (has.empty() ? "" : " (it has " + has + ")"));
                continue;
            }
            const std::string setName = size_t(set) < vertices.uvSetNames().size()
                                            ? vertices.uvSetNames()[size_t(set)]
                                            : formatText("%d", set);
            usable.push_back(shape.target() + " (UV set " + quoted(setName) + ")");
        }
        if (usable.empty()) {
            out.push_back({FindingLevel::kError,
                           "target " + name + ": nothing to bake: " +
                               (skipped.empty() ? std::string("targetSurfaces lists no BakeShape")
                                                : joined(skipped))});
            continue;
        }
        for (const std::string &why : skipped)
            out.push_back({FindingLevel::kWarning,
                           "target " + name + ": " + why + "; the run skips that shape"});
        out.push_back(
            {FindingLevel::kOk,
             formatText("target %s: %g x %g texels; ", name.c_str(), w, h) + joined(usable)});
    }
}

}  // namespace

std::vector<RunFinding> checkRunAgainstScene(const OXConfig &config, const Scene &scene) {
    std::vector<RunFinding> out;
    const FrameSettingsBase &frame = config.FrameSettings;
    const bool bakes = frame.renderType() == RenderType::TextureBake;
    const TextureBakeSettingsBase &bake = config.TextureBakeSettings;

    // What kind of run, and what a texture bake would write.
    if (bakes) {
        const std::vector<std::string> passes = bakePassList(bake.RenderComponents);
        if (passes.empty())
            out.push_back({FindingLevel::kError,
                           "renderType TextureBake, but no pass is switched on in "
                           "TextureBakeSettings/RenderComponents (the run stops with status 10)"});
        else
            out.push_back(
                {FindingLevel::kOk,
                 "renderType TextureBake: " + plural(bake.targets.size(), "target", "targets") +
                     ", " + plural(passes.size(), "pass", "passes") + " (" + joined(passes) + ")"});
        if (bake.targets.size() == 0)
            out.push_back(
                {FindingLevel::kError,
                 "TextureBakeSettings/targets lists no BakeTextureTarget: nothing to bake"});
    } else {
        out.push_back({FindingLevel::kNote, "renderType " + renderTypeName(frame)});
    }
    if (bakes || bake.targets.size() > 0) checkTargets(config, scene, out);

    // The camera.
    const std::string cameraName = frame.cameraName();
    if (scene.findCamera(cameraName)) {
        out.push_back({FindingLevel::kOk, "cameraName " + quoted(cameraName) + " names a camera"});
    } else if (const Camera *camera = scene.runCamera(cameraName)) {
        out.push_back({bakes ? FindingLevel::kNote : FindingLevel::kWarning,
                       "cameraName " + quoted(cameraName) + " names no camera; the run uses " +
                           quoted(camera->name()) + ", the scene's first"});
    }

    // Something must give light.
    std::vector<std::string> lights, emissive;
    for (const auto &light : scene.lights()) lights.push_back(light->name());
    for (const Material *m : scene.materials().materials())
        if (isEmissive(*m)) emissive.push_back(m->name());
    if (lights.empty() && emissive.empty()) {
        out.push_back({FindingLevel::kWarning,
                       "the scene has no light and no emissive material: everything will be "
                       "black (README, \"Adding lights\", has ready LightSource blocks)"});
    } else {
        std::string text;
        if (!lights.empty())
            text = plural(lights.size(), "light", "lights") + " (" + joined(lights) + ")";
        if (!emissive.empty())
            text += (text.empty() ? "" : ", ") +
                    plural(emissive.size(), "emissive material", "emissive materials") + " (" +
                    joined(emissive) + ")";
        out.push_back({FindingLevel::kOk, text});
    }
    return out;
}

bool runWouldProceed(const std::vector<RunFinding> &findings) {
    for (const RunFinding &f : findings)
        if (f.level == FindingLevel::kError) return false;
    return true;
}

std::string formatFindings(const std::vector<RunFinding> &findings) {
    static const char *const kLabel[] = {"ok", "note", "warning", "error"};
    std::string s;
    for (const RunFinding &f : findings)
        s += formatText("  %-8s ", kLabel[int(f.level)]) + f.text + "\n";
    return s;
}

}  // namespace ox
