#include "shading/pass.h"

#include <cmath>

#include "shading/light_loop.h"

namespace ox {
namespace {

// The shading normal on the side the ray arrived from.
Vec3 facingNormal(const ShadingContext &ctx) {
    return ctx.surface.backSide ? -ctx.surface.normal : ctx.surface.normal;
}

Color blackWithWeight(const ShadingContext &ctx) { return Color(0, 0, 0, ctx.colorWeight.a); }

}  // namespace

Color MaskPass::shade(ShadingContext &ctx, const SurfaceShaderInterface &shader) const {
    const uint32_t mask = fullOnGIRays_ && ctx.isGIRay() ? kShadeAll : mask_;
    if (mask == kShadeNone) return blackWithWeight(ctx);
    ctx.componentMask = mask;
    return shader.shade(ctx);
}

Color SecondaryPassOverride::shade(ShadingContext &ctx, const SurfaceShaderInterface &shader) const {
    const uint32_t component = mode_ == kReflections ? kShadeReflections : kShadeRefractions;
    uint32_t mask;
    if (ctx.rayType == kRayPrimary) {
        mask = mode_ == kReflections || ctx.refractionDepth == 0 ? component : kShadeAll;
    } else {
        const uint32_t depth = mode_ == kReflections
                                   ? ctx.reflectionDepth
                                   : uint32_t(ctx.refractionDepth) + ctx.transparencyDepth;
        mask = depth < depthLimit_ && depth < maxDepth_ ? (ctx.componentMask | component)
                                                        : kShadeAll;
    }
    if (mask == kShadeNone) return blackWithWeight(ctx);
    ctx.componentMask = mask;
    return shader.shade(ctx);
}

namespace {

// Direct light over every linked light (cosine-weighted; ambient-only lights with 1).
Color directIllumination(ShadingContext &ctx, const Vec3 &n, bool withShadows) {
    Color sum;
    const uint32_t mask = kShadeDiffuse | kShadeAmbient;
    forEachLight(ctx, ctx.surface.position, [&](const LightSource &light, uint32_t) {
        const uint32_t f = lightFlags(light);
        if (diffuseWeight(f, mask, 1.0f) < 0.0f) return;
        LightSample ls;
        sampleLight(light, ctx, ctx.surface.position, n, withShadows, ls);
        if (!(ls.color.luminance() > 0.0001f)) return;
        const float c = diffuseWeight(f, mask, ls.cosine);
        if (c > 0.0f) sum += ls.color * c;
    });
    return sum;
}

Color indirectIllumination(ShadingContext &ctx) {
    return ctx.scene && ctx.scene->indirect ? ctx.scene->indirect->irradiance(ctx)
                                            : Color::black();
}

Color opaque(Color c) {
    c.a = 1.0f;
    return c;
}

}  // namespace

Color gatherIllumination(ShadingContext &ctx, bool withShadows) {
    return opaque(directIllumination(ctx, facingNormal(ctx), withShadows) +
                  indirectIllumination(ctx));
}

Color IlluminationPass::shade(ShadingContext &ctx, const SurfaceShaderInterface &shader) const {
    if (ctx.isGIRay()) return shader.shade(ctx);
    if (cameraMode_ && ctx.rayType == kRayPrimary) return Color::white();
    return gatherIllumination(ctx);
}

Color CombinedIlluminationPass::shade(ShadingContext &ctx,
                                      const SurfaceShaderInterface &shader) const {
    if (ctx.isGIRay()) return shader.shade(ctx);
    return gatherIllumination(ctx);
}

void CombinedIlluminationPass::shadeAll(ShadingContext &ctx, const SurfaceShaderInterface &shader,
                                        Color *out) const {
    if (ctx.isGIRay()) {
        out[0] = out[1] = shader.shade(ctx);
        return;
    }
    const Color indirect = indirectIllumination(ctx);
    out[0] = opaque(directIllumination(ctx, facingNormal(ctx), true) + indirect);
    out[1] = opaque(indirect);
}

void rnmBasis(int32_t basis, Vec3 out[3]) {
    constexpr float kA = 0.8164966f, kB = 0.5773503f, kC = 0.4082483f, kD = 0.7071068f;
    const float s = basis == RnmSettings::kUnrealEngineFlipped ? -1.0f : 1.0f;
    out[0] = Vec3(kA, 0.0f, kB);
    out[1] = Vec3(-kC, kD * s, kB);
    out[2] = Vec3(-kC, -kD * s, kB);
}

RnmPass::RnmPass(const RnmSettings &settings, std::string name)
    : RenderPass(std::move(name)), settings_(settings) {
    if (!std::isfinite(settings_.cosLobeExponent) || settings_.cosLobeExponent < 0.0f)
        settings_.cosLobeExponent = 1.0f;
    if (!std::isfinite(settings_.lambertianClamp)) settings_.lambertianClamp = 2.0f;
    rnmBasis(settings_.basis, basis_);
}

Color RnmPass::shade(ShadingContext &ctx, const SurfaceShaderInterface &shader) const {
    Color out[4];
    shadeAll(ctx, shader, out);
    return out[0];
}

void RnmPass::shadeAll(ShadingContext &ctx, const SurfaceShaderInterface &shader,
                       Color *out) const {
    const int n = outputCount();
    if (ctx.isGIRay()) {
        const Color c = shader.shade(ctx);
        for (int i = 0; i < n; ++i) out[i] = c;
        return;
    }
    // An orthonormal tangent frame of the shading normal, keeping the mesh's handedness.
    const Vec3 nrm = facingNormal(ctx);
    Vec3 t = ctx.surface.tangent - nrm * dot(nrm, ctx.surface.tangent);
    if (!(t.lengthSquared() > 1e-12f)) {
        t = std::fabs(nrm.x) < 0.6f ? Vec3(1, 0, 0) : Vec3(0, 1, 0);
        t = t - nrm * dot(nrm, t);
    }
    t.normalize();
    Vec3 b = cross(nrm, t);
    if (dot(b, ctx.surface.bitangent) < 0.0f) b = -b;

    Color sum[4];
    const RnmSettings &s = settings_;
    auto add = [&](const Color &light, const float w[4]) {
        for (int i = 0; i < 4; ++i) {
            Color c = light * w[i];
            if (s.enableLambertianClamp && i < 3) {
                c.r = std::fmin(c.r, s.lambertianClamp);
                c.g = std::fmin(c.g, s.lambertianClamp);
                c.b = std::fmin(c.b, s.lambertianClamp);
            }
            sum[i] += c;
        }
    };
    // Light that arrives along the normal (ambient lights, indirect irradiance) projects onto
    // every basis vector by its z component.
    const float alongNormal[4] = {basis_[0].z, basis_[1].z, basis_[2].z, 1.0f};

    if (s.components != RnmSettings::kIndirectLight) {
        forEachLight(ctx, ctx.surface.position, [&](const LightSource &light, uint32_t) {
            const uint32_t f = lightFlags(light);
            const uint32_t mask = kShadeDiffuse | kShadeAmbient;
            if (diffuseWeight(f, mask, 1.0f) < 0.0f) return;
            LightSample ls;
            sampleLight(light, ctx, ctx.surface.position, nrm, true, ls);
            if (!(ls.color.luminance() > 0.0001f)) return;
            if (!(f & kShadeDiffuse)) {
                add(ls.color, alongNormal);
                return;
            }
            const Vec3 d(dot(ls.direction, t), dot(ls.direction, b), dot(ls.direction, nrm));
            if (s.allowNegative == RnmSettings::kDisallowCullHorizon && !(d.z > 0.0f)) return;
            float w[4];
            for (int i = 0; i < 3; ++i) {
                float c = dot(basis_[i], d);
                if (s.allowNegative != RnmSettings::kAllow && c < 0.0f) c = 0.0f;
                if (s.cosLobeExponent != 1.0f)
                    c = std::copysign(std::pow(std::fabs(c), s.cosLobeExponent), c);
                w[i] = c;
            }
            w[3] = std::fmax(0.0f, d.z);
            add(ls.color, w);
        });
    }
    if (s.components != RnmSettings::kDirectLight) add(indirectIllumination(ctx), alongNormal);

    // Adjusted intensity: the mean of the three basis outputs equals the light along the normal.
    const float k = s.adjustIntensity ? 1.7320508f : 1.0f;
    for (int i = 0; i < n; ++i) {
        const float ki = i < 3 ? k : 1.0f;
        out[i] = Color(sum[i].r * ki, sum[i].g * ki, sum[i].b * ki, 1.0f);
    }
}

Color NormalsPass::shade(ShadingContext &ctx, const SurfaceShaderInterface &) const {
    const Vec3 n = facingNormal(ctx);
    return Color(0.5f * n.x + 0.5f, 0.5f * n.y + 0.5f, 0.5f * n.z + 0.5f, 1.0f);
}

void DepthPass::setReference(const Vec3 &position, const Vec3 &normal, float offset,
                             float scale) {
    hasReference_ = true;
    position_ = position;
    normal_ = normal.normalized();
    offset_ = std::isfinite(offset) ? offset : 0.0f;
    scale_ = std::isfinite(scale) ? scale : 1.0f;
}

Color DepthPass::shade(ShadingContext &ctx, const SurfaceShaderInterface &) const {
    if (!hasReference_) return Color::black();
    const Vec3 d = ctx.surface.position - position_;
    float dist = d.length();
    if (dot(d, normal_) < 0.0f) dist = -dist;
    const float v = (dist + offset_) * scale_;
    return Color(v, v, v, v);
}

std::unique_ptr<RenderPass> createRenderPass(const std::string &name) {
    constexpr uint32_t kAll = kShadeAll, kShadows = kShadeShadows;
    struct MaskEntry {
        const char *name;
        uint32_t mask;
    };
    static const MaskEntry kMasks[] = {
        {"color", kAll & ~kShadows},
        {"specular", kAll & ~(kShadows | kShadeDiffuse | kShadeAmbient | kShadeIncandescence)},
        {"diffuse", kAll & ~(kShadows | kShadeSpecular | kShadeAmbient | kShadeIncandescence)},
        {"tpDiffuse", kShadeDiffuse | kShadows},
        {"tpSpecular", kShadeSpecular | kShadows},
        {"tpAmbient", kShadeAmbient | kShadows},
        {"tpIncandescence", kShadeIncandescence | kShadows},
        {"tpSss", kShadeSubSurface},
    };
    if (name == "beauty") return std::make_unique<NullRenderPass>(name);
    if (name == "shadow") return std::make_unique<ShadowPassOverride>(name);
    if (name == "tpAlbedo") return std::make_unique<AlbedoPass>(name);
    if (name == "tpReflections")
        return std::make_unique<SecondaryPassOverride>(name, SecondaryPassOverride::kReflections,
                                                       0, 10000);
    if (name == "tpRefractions")
        return std::make_unique<SecondaryPassOverride>(name, SecondaryPassOverride::kRefractions,
                                                       0, 10000);
    for (const MaskEntry &e : kMasks)
        if (name == e.name) return std::make_unique<MaskPass>(name, e.mask);
    return nullptr;
}

RenderPass *RenderPassSet::find(const std::string &name) {
    auto it = passes_.find(name);
    if (it != passes_.end()) return it->second.get();
    std::unique_ptr<RenderPass> pass = createRenderPass(name);
    if (!pass) {
        if (name == "tpIllumination")
            pass = std::make_unique<IlluminationPass>(name);
        else if (name == "tpFullandIndirectIllumination")
            pass = std::make_unique<CombinedIlluminationPass>(name);
        else if (name == "tpRnm")
            pass = std::make_unique<RnmPass>(rnm, name);
        else if (name == "tpNormals")
            pass = std::make_unique<NormalsPass>(name);
        else if (name == "tpDepth")
            pass = std::make_unique<DepthPass>(name);
    }
    return pass ? add(std::move(pass)) : nullptr;
}

RenderPass *RenderPassSet::add(std::unique_ptr<RenderPass> pass) {
    if (!pass) return nullptr;
    RenderPass *p = pass.get();
    passes_[p->name()] = std::move(pass);
    return p;
}

}  // namespace ox
