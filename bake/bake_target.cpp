#include "bake/bake_target.h"

#include <cctype>
#include <cmath>
#include <map>

#include "core/message.h"
#include "raytrace/instance.h"
#include "scene/scene.h"

namespace ox {

std::vector<std::string> bakePassList(const RenderComponentsBase &c) {
    std::vector<std::string> passes;
    const std::pair<bool, const char *> fixed[] = {
        {c.illumination(), "tpIllumination"},
        {c.indirectIllumination(), "tpIndirectIllumination"},
        {c.albedo(), "tpAlbedo"},
        {c.diffuse(), "tpDiffuse"},
        {c.specular(), "tpSpecular"},
        {c.ambient(), "tpAmbient"},
        {c.incandescence(), "tpIncandescence"},
        {c.sss(), "tpSss"},
        {c.reflections(), "tpReflections"},
        {c.refractions(), "tpRefractions"},
        {c.rnm(), "tpRnm"},
        {c.fullAndIndirectIllumination(), "tpFullandIndirectIllumination"},
        {c.lua(), "tpLua"},
        {c.normals(), "tpNormals"},
    };
    for (const auto &[on, name] : fixed)
        if (on) passes.emplace_back(name);
    for (size_t i = 0; i < c.customPasses.size(); ++i) passes.push_back(c.customPasses[i]);
    // Light passes are named by their position, so that two entries never share a layer.
    for (size_t i = 0; i < c.lightPass.size(); ++i)
        passes.push_back("tpLightPass" + std::to_string(i));
    if (c.fullShading()) passes.emplace_back("beauty");
    return passes;
}

BakeTargetSize bakeTargetSize(const BakeTextureTargetBase &target, float resolutionScale,
                              const Vec2i &frameResolution) {
    const Vec2i base =
        target.hasResolutionOverride() ? target.resolutionOverride() : frameResolution;
    // The product is formed in double and clamped before the conversion, so that a huge
    // scale or a NaN gives a size that validation rejects instead of undefined behaviour.
    auto scaled = [&](int32_t edge) -> int64_t {
        const double v = double(edge) * double(resolutionScale);
        if (!(v > -1e12 && v < 1e12)) return -1;
        return int64_t(v);
    };
    return {scaled(base.x), scaled(base.y)};
}

bool validBakeSize(const BakeTargetSize &size) {
    return size.width >= 1 && size.height >= 1 && size.width <= kMaxBakeTargetEdge &&
           size.height <= kMaxBakeTargetEdge;
}

bool validateBakeTargets(const TextureBakeSettingsBase &settings, const Vec2i &frameResolution) {
    bool ok = true;
    std::map<std::string, size_t> names;
    for (size_t i = 0; i < settings.targets.size(); ++i) {
        const BakeTextureTargetBase &t = settings.targets[i];
        const BakeTargetSize size = bakeTargetSize(t, settings.resolutionScale(), frameResolution);
        if (!validBakeSize(size)) {
            message(kMsgError, 6, "BakeTextureTarget '%s' with invalid dimension %lldx%lld.\n",
                    t.textureName().c_str(), static_cast<long long>(size.width),
                    static_cast<long long>(size.height));
            ok = false;
        }
        auto [it, fresh] = names.emplace(t.textureName(), i);
        if (!fresh) {
            message(kMsgError, 6,
                    "BakeTextureTarget %zu and %zu are both named '%s': their files would "
                    "overwrite each other.",
                    it->second + 1, i + 1, t.textureName().c_str());
            ok = false;
        }
    }
    return ok;
}

int32_t defaultLightMapUvSet(const VertexList &vertices) {
    const std::vector<std::string> &names = vertices.uvSetNames();
    for (size_t k = 0; k < names.size() && k < vertices.uvSetCount(); ++k) {
        std::string lower = names[k];
        for (char &ch : lower) ch = char(std::tolower(static_cast<unsigned char>(ch)));
        if (lower == "lightmap") return int32_t(k);
    }
    return vertices.uvSetCount() >= 2 ? 1 : 0;
}

std::string bakeShapeUvSetName(const TextureBakeSettingsBase &settings,
                               const BakeShapeBase &shape) {
    return shape.hasUVSetOverride() ? shape.UVSetOverride() : settings.uvSet();
}

int32_t bakeShapeUvSet(const TextureBakeSettingsBase &settings, const BakeShapeBase &shape,
                       const VertexList &vertices) {
    const std::string name = bakeShapeUvSetName(settings, shape);
    if (name.empty()) return defaultLightMapUvSet(vertices);
    const int32_t set = vertices.findUvSet(name);
    return set >= 0 && uint32_t(set) < vertices.uvSetCount() ? set : -1;
}

std::vector<ResolvedBakeShape> resolveBakeShapes(const TextureBakeSettingsBase &settings,
                                                 const BakeTextureTargetBase &target,
                                                 const Scene &scene) {
    std::vector<ResolvedBakeShape> shapes;
    std::map<const Instance *, uint32_t> indexOf;
    for (uint32_t i = 0; i < scene.instances().size(); ++i) indexOf[scene.instances()[i].get()] = i;

    for (size_t s = 0; s < target.targetSurfaces.size(); ++s) {
        const BakeShapeBase &b = target.targetSurfaces[s];
        const Instance *instance = scene.findInstance(b.target());
        if (!instance) {
            message(kMsgError, 6, "Instance %s not found, make sure it exists in the scene",
                    b.target().c_str());
            continue;
        }
        ResolvedBakeShape r;
        r.instance = instance;
        r.instanceIndex = indexOf[instance];
        const VertexList &vl = instance->shape().vertices();
        r.uvSet = bakeShapeUvSet(settings, b, vl);
        if (r.uvSet < 0) {
            message(kMsgError, 6, "Target %s: instance %s has no UV set '%s'; skipped.",
                    target.textureName().c_str(), b.target().c_str(),
                    bakeShapeUvSetName(settings, b).c_str());
            continue;
        }
        if (vl.uvSetCount() == 0) {
            message(kMsgError, 6, "Target %s: instance %s has no UV set; skipped.",
                    target.textureName().c_str(), b.target().c_str());
            continue;
        }
        r.uvScale = b.UVScale();
        r.uvBias = b.UVBias();
        if (!(r.uvScale.x != 0.0f && r.uvScale.y != 0.0f && std::isfinite(r.uvScale.x) &&
              std::isfinite(r.uvScale.y) && std::isfinite(r.uvBias.x) &&
              std::isfinite(r.uvBias.y))) {
            message(kMsgError, 6, "Target %s with instance %s has a non-invertible UV-matrix!",
                    target.textureName().c_str(), b.target().c_str());
            continue;
        }
        r.name = b.name().empty() ? b.target() : b.name();
        shapes.push_back(std::move(r));
    }
    return shapes;
}

std::optional<UvRect> bakeUvRect(const TextureBakeSettingsBase &settings,
                                 const std::vector<ResolvedBakeShape> &shapes,
                                 const std::string &targetName) {
    UvRect rect;
    switch (settings.uvRange()) {
        case UVRangeType::Default:
            break;
        case UVRangeType::Entire: {
            float u0 = 3.4e38f, v0 = 3.4e38f, u1 = -3.4e38f, v1 = -3.4e38f;
            for (const ResolvedBakeShape &s : shapes) {
                const Shape &shape = s.instance->shape();
                const VertexSet<Vec2> uv = shape.vertices().uvSet(s.uvSet);
                for (const Triangle &t : shape.triangles())
                    for (uint32_t c : t.v) {
                        const float u = uv[c].x * s.uvScale.x + s.uvBias.x;
                        const float v = uv[c].y * s.uvScale.y + s.uvBias.y;
                        u0 = std::fmin(u0, u), u1 = std::fmax(u1, u);
                        v0 = std::fmin(v0, v), v1 = std::fmax(v1, v);
                    }
            }
            if (u0 <= u1 && v0 <= v1) rect = {u0, v0, u1, v1};
            break;
        }
        case UVRangeType::Specified:
            rect = {settings.uMin(), settings.vMin(), settings.uMax(), settings.vMax()};
            break;
    }
    if (!(rect.uMax > rect.uMin && rect.vMax > rect.vMin && std::isfinite(rect.uMax - rect.uMin) &&
          std::isfinite(rect.vMax - rect.vMin))) {
        message(kMsgError, 6, "Target %s: the UV range [%g, %g] x [%g, %g] has no area.",
                targetName.c_str(), rect.uMin, rect.uMax, rect.vMin, rect.vMax);
        return std::nullopt;
    }
    return rect;
}

}  // namespace ox
