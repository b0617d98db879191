#include "shading/phong.h"

#include <algorithm>
#include <cmath>

#include "core/message.h"
#include "shading/light_loop.h"
#include "shading/trace.h"

namespace {

using ox::Color;
using ox::Vec3;

const char *const kChannelNames[ox::kPhongChannelCount] = {
    "Diffuse", "Ambient", "Transparency", "Emissive", "Specular", "Reflection", "Normal"};

// Moves a colour towards its luminance (s = 0: grey, 1: unchanged).
Color saturate(const Color &c, float s) {
    const float l = c.luminance();
    return Color(l + (c.r - l) * s, l + (c.g - l) * s, l + (c.b - l) * s, c.a);
}

Color clamp01(const Color &c) {
    auto f = [](float v) { return v > 1.0f ? 1.0f : (v > 0.0f ? v : 0.0f); };
    return Color(f(c.r), f(c.g), f(c.b), f(c.a));
}

// Weights the colour's R, G, B by the context's weight and gives it the weight's alpha.
Color weighted(Color c, const Color &w) {
    return Color(c.r * w.r, c.g * w.g, c.b * w.b, w.a);
}

ox::PhongParameters withSets(const ox::PhongParameters &p, const std::vector<int32_t> &sets) {
    ox::PhongParameters out = p;
    for (int c = 0; c < ox::kPhongChannelCount && c < int(sets.size()); ++c)
        out.channels[c].uvSet = sets[size_t(c)];
    return out;
}

}  // namespace

namespace ox {

PhongShadingSample::PhongShadingSample(const PhongParameters &p, const ShadingContext &ctx)
    : params_(p) {
    diffuse_ = evaluateChannel(p.channels[kPhongDiffuse], ctx);
    ambient_ = evaluateChannel(p.channels[kPhongAmbient], ctx);
    emissive_ = evaluateChannel(p.channels[kPhongEmissive], ctx);
    specular_ = evaluateChannel(p.channels[kPhongSpecular], ctx);
    reflection_ = evaluateChannel(p.channels[kPhongReflection], ctx);
    Color t = clamp01(evaluateChannel(p.channels[kPhongTransparency], ctx));
    if (p.diffuseAlphaAsTransparency) {
        // The diffuse alpha is an opacity that multiplies the transparency channel's opacity.
        const float opacity = diffuse_.a > 1.0f ? 1.0f : (diffuse_.a > 0.0f ? diffuse_.a : 0.0f);
        t = Color(1.0f - (1.0f - t.r) * opacity, 1.0f - (1.0f - t.g) * opacity,
                  1.0f - (1.0f - t.b) * opacity, 1.0f - (1.0f - t.a) * opacity);
    }
    transparency_ = t;

    const SurfacePoint &sp = ctx.surface;
    normal_ = sp.normal;
    const MaterialChannel &nc = p.channels[kPhongNormal];
    // A normal channel whose texture failed to load leaves the normal as it is.
    if (!nc.isConstant() && (nc.useVertexColor || nc.texture)) {
        // The tangent frame of the channel's UV set (the point's shading frame for set 0 or a
        // set without tangents).
        const SurfaceUv &set = sp.uvs[channelUvSet(nc, sp)];
        const bool own = channelUvSet(nc, sp) != 0 && set.tangent.lengthSquared() > 0.0f &&
                         set.bitangent.lengthSquared() > 0.0f;
        normal_ = applyNormalColor(evaluateChannel(nc, ctx), sp.normal,
                                   own ? set.tangent : sp.tangent,
                                   own ? set.bitangent : sp.bitangent);
    }
    geometricNormal_ = sp.geometricNormal;
    if (sp.backSide && p.twosided) {
        normal_ = -normal_;
        geometricNormal_ = -geometricNormal_;
    }
}

void loadChannelTextures(const std::string &material, PhongParameters &p,
                         TextureFactory &textures) {
    for (int c = 0; c < kPhongChannelCount; ++c) {
        MaterialChannel &ch = p.channels[c];
        if (ch.textureFile.empty() || ch.texture) continue;
        std::unique_ptr<OXTexture> t = textures.getTexture(ch.textureFile, kFilterEWA);
        if (!t) {
            message(kMsgWarning, 3,
                    "Failed to create texture %s for the %s channel of material %s, it will be "
                    "rendered as black",
                    ch.textureFile.c_str(), kChannelNames[c], material.c_str());
            continue;
        }
        ch.texture = std::move(t);
    }
}

void validatePhongParameters(const std::string &name, PhongParameters &p) {
    auto finite = [&](float &v, float fallback, const char *what) {
        if (std::isfinite(v)) return;
        message(kMsgWarning, 3, "Material %s: %s is not a finite number, using %g", name.c_str(),
                what, double(fallback));
        v = fallback;
    };
    finite(p.primaryGIIntensity, 1.0f, "PrimaryGIIntensity");
    finite(p.primaryGISaturation, 1.0f, "PrimaryGISaturation");
    finite(p.secondaryGIIntensity, 1.0f, "SecondaryGIIntensity");
    finite(p.secondaryGISaturation, 1.0f, "SecondaryGISaturation");
    finite(p.diffuseGIBoost, 1.0f, "DiffuseGIBoost");
    finite(p.emissiveGIScale, 1.0f, "EmissiveGIScale");
    finite(p.specularGIScale, 1.0f, "SpecularGIScale");
    finite(p.shininess, 1.0f, "Shininess");
    if (p.shininess < 0.0f) {
        message(kMsgWarning, 3, "Material %s: Shininess %g is negative, using 0", name.c_str(),
                double(p.shininess));
        p.shininess = 0.0f;
    }
    for (int c = 0; c < kPhongChannelCount; ++c) {
        MaterialChannel &ch = p.channels[c];
        const std::string what = std::string(kChannelNames[c]) + " Scale";
        finite(ch.scale, 1.0f, what.c_str());
        Color &k = ch.color;
        if (!std::isfinite(k.r) || !std::isfinite(k.g) || !std::isfinite(k.b) ||
            !std::isfinite(k.a)) {
            message(kMsgWarning, 3, "Material %s: %s Color is not finite, using black",
                    name.c_str(), kChannelNames[c]);
            k = Color::black();
        }
        if (ch.swizzle[0] != 255 &&
            (ch.swizzle[0] > 3 || ch.swizzle[1] > 3 || ch.swizzle[2] > 3 || ch.swizzle[3] > 3)) {
            message(kMsgWarning, 3,
                    "Material %s: %s swizzle (%d, %d, %d, %d) names a channel above 3, the "
                    "channel is left unswizzled",
                    name.c_str(), kChannelNames[c], ch.swizzle[0], ch.swizzle[1], ch.swizzle[2],
                    ch.swizzle[3]);
            ch.swizzle[0] = 255;
        }
    }
}

}  // namespace ox

PhongShader::PhongShader(std::string name, const ox::PhongParameters &parameters)
    : SurfaceShaderInterface(std::move(name)), parameters_(parameters) {
    ox::validatePhongParameters(this->name(), parameters_);
}

Color PhongShader::shade(ox::ShadingContext &ctx) const {
    using namespace ox;
    const uint32_t mask = ctx.componentMask;
    if (mask == kShadeNone) return weighted(Color::black(), ctx.colorWeight);
    const PhongShadingSample s(parameters_, ctx);
    const PhongParameters &p = parameters_;
    const Vec3 &pos = ctx.surface.position;
    const Vec3 &n = s.normal();
    const bool gi = ctx.isGIRay();

    // Base term: the material's own light and the indirect light of the GI integrators.
    Color base;
    if (mask & kShadeAmbient) base += s.ambient();
    if (mask & kShadeIncandescence) base += s.emissive() * (gi ? p.emissiveGIScale : 1.0f);
    if ((mask & kShadeIndirect) && ctx.scene && ctx.scene->indirect) {
        const Color e = saturate(ctx.scene->indirect->irradiance(ctx),
                                 gi ? p.secondaryGISaturation : p.primaryGISaturation);
        const float k = gi ? p.secondaryGIIntensity * p.diffuseGIBoost : p.primaryGIIntensity;
        base += s.diffuse() * e * k;
    }

    // Direct light.
    Color diffuseSum, specularSum;
    const bool wantSpecular = (mask & kShadeSpecular) != 0;
    if (mask & (kShadeDiffuse | kShadeAmbient | kShadeSpecular)) {
        const bool withShadow = (mask & kShadeShadows) != 0;
        const Vec3 r = reflect(ctx.rayDirection, n);
        const float shininess = p.shininess;
        forEachLight(ctx, pos, [&](const LightSource &light, uint32_t) {
            const uint32_t f = lightFlags(light);
            const bool specular = wantSpecular && (f & kShadeSpecular);
            if (!specular && diffuseWeight(f, mask, 1.0f) < 0.0f) return;
            LightSample ls;
            sampleLight(light, ctx, pos, n, withShadow, ls);
            if (!(ls.color.luminance() > 0.0001f)) return;
            const float c = diffuseWeight(f, mask, ls.cosine);
            if (c > 0.0f) diffuseSum += ls.color * c;
            if (specular && dot(n, ls.direction) > 0.0f) {
                const float sd = std::fmax(0.0f, dot(ls.direction, r));
                specularSum += ls.color * std::pow(sd, shininess);
            }
        });
    }
    Color col = base + s.diffuse() * diffuseSum +
                s.specular() * specularSum * (gi ? p.specularGIScale : 1.0f);

    // Only the opaque part of the surface shades; the rest passes light through.
    const Color t = s.transparency();
    col = Color(col.r * (1.0f - t.r), col.g * (1.0f - t.g), col.b * (1.0f - t.b), 1.0f);
    col = weighted(col, ctx.colorWeight);

    if (!ctx.scene) return col;
    const ShadingSettings &set = ctx.scene->settings;
    const Vec3 &ng = s.geometricNormal();
    // The geometric normal on the side the ray came from: secondary rays start off it.
    const Vec3 front = dot(ctx.rayDirection, ng) <= 0.0f ? ng : -ng;
    const float bias = ctx.bias();

    if (mask & kShadeReflections) {
        const Color w = s.reflection() * ctx.colorWeight;
        const uint32_t limit = set.reflectionDepth < 10u ? set.reflectionDepth : 10u;
        if (w.luminance() > set.reflectionThreshold && ctx.reflectionDepth < limit &&
            ctx.rayDepth < std::min(set.maxRayDepth, kMaxSecondaryDepth)) {
            ShadingContext child = ctx;
            child.rayType = gi ? kRayFinalGather : kRayReflection;
            ++child.reflectionDepth;
            ++child.rayDepth;
            child.colorWeight = Color(w.r, w.g, w.b, ctx.colorWeight.a);
            child.componentMask = kShadeAll;
            const Vec3 dir = reflect(ctx.rayDirection, n).normalize();
            const Color c = traceSecondary(child, pos + front * bias, dir);
            col.r += c.r, col.g += c.g, col.b += c.b;
        }
    }
    if ((mask & kShadeRefractions) && t.luminance() > 0.005f) {
        const Color w = t * ctx.colorWeight;
        const uint32_t limit =
            std::min(gi ? set.giTransparencyDepth : set.transparencyDepth, kMaxSecondaryDepth);
        if (w.luminance() > set.refractionThreshold && ctx.transparencyDepth < limit) {
            ShadingContext child = ctx;
            if (!gi) child.rayType = kRayRefraction;
            ++child.transparencyDepth;
            child.colorWeight = Color(w.r, w.g, w.b, ctx.colorWeight.a);
            child.componentMask = kShadeAll;
            const Color c = traceSecondary(child, pos - front * bias, ctx.rayDirection);
            col.r += c.r, col.g += c.g, col.b += c.b;
        }
    }
    return col;
}

Color PhongShader::shadow(ox::ShadingContext &ctx) const {
    using namespace ox;
    const PhongShadingSample s(parameters_, ctx);
    Color shadowed, unshadowed;
    const Vec3 &pos = ctx.surface.position;
    forEachLight(ctx, pos, [&](const LightSource &light, uint32_t) {
        const float c0 = diffuseWeight(lightFlags(light), kShadeAll, 1.0f);
        if (c0 < 0.0f) return;
        Color sh, un;
        float cosine = 0.0f;
        sampleLightBoth(light, ctx, pos, s.normal(), sh, un, cosine);
        const float c = diffuseWeight(lightFlags(light), kShadeAll, cosine);
        shadowed += sh * c;
        unshadowed += un * c;
    });
    const float u = unshadowed.luminance();
    float ratio = u > 1e-8f ? shadowed.luminance() / u : 1.0f;
    ratio = ratio > 1.0f ? 1.0f : (ratio > 0.0f ? ratio : 0.0f);
    return Color(ratio, ratio, ratio, 1.0f);
}

Color PhongShader::transmission(ox::ShadingContext &ctx) const {
    const ox::PhongShadingSample s(parameters_, ctx);
    return s.transparency();
}

Color PhongShader::albedo(ox::ShadingContext &ctx) const {
    const ox::PhongShadingSample s(parameters_, ctx);
    return weighted(s.diffuse(), ctx.colorWeight);
}

bool PhongShader::hasUvOverrides() const {
    for (const auto &c : parameters_.channels)
        if (!c.uvLayerOverride.empty()) return true;
    return false;
}

std::vector<int32_t> PhongShader::resolveUvSets(const std::vector<std::string> &uvSetNames) const {
    std::vector<int32_t> sets(ox::kPhongChannelCount, -1);
    for (int c = 0; c < ox::kPhongChannelCount; ++c) {
        const std::string &want = parameters_.channels[c].uvLayerOverride;
        if (want.empty()) continue;
        for (size_t k = 0; k < uvSetNames.size(); ++k)
            if (uvSetNames[k] == want) {
                sets[size_t(c)] = static_cast<int32_t>(k);
                break;
            }
    }
    return sets;
}

std::string PhongShader::variantName(const std::vector<int32_t> &sets) const {
    std::string n = name() + "|uv";
    for (size_t i = 0; i < sets.size(); ++i) {
        n += i == 0 ? ':' : ',';
        n += std::to_string(sets[i]);
    }
    return n;
}

PhongShaderUVOverride::PhongShaderUVOverride(std::string name, const PhongShader &base,
                                             const std::vector<int32_t> &sets)
    : PhongShader(std::move(name), withSets(base.parameters(), sets)) {}
