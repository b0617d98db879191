#pragma once

#include <cmath>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "shading/shader.h"
#include "shading/shading_context.h"
#include "texture/texture_factory.h"

namespace ox {

/// One channel of a material (diffuse, ambient, ...): a constant colour, a texture or the
/// vertex colour, then scale, clamp, invert and swizzle.
struct MaterialChannel {
    bool useVertexColor = false;
    /// Multiplies R, G and B.
    float scale = 1.0f;
    bool clamp = false;
    bool invert = false;
    /// The colour when there is neither a texture nor the vertex colour.
    Color color;
    /// Texture file (empty: none); loaded by the texture manager.
    std::string textureFile;
    /// The loaded texture (null with a file name: the texture failed to load and the channel
    /// answers opaque black).
    std::shared_ptr<const OXTexture> texture;
    /// Name of the UV set the texture uses instead of the shape's default (empty: none).
    std::string uvLayerOverride;
    /// The UV set of the texture lookup on one shape (-1: the texture's default set).
    int32_t uvSet = -1;
    /// Source channel of R, G, B, A; a first byte of 255 means no swizzle.
    uint8_t swizzle[4] = {255, 1, 2, 3};

    /// True when the channel answers the same colour everywhere.
    bool isConstant() const { return !useVertexColor && textureFile.empty(); }
};

/// Channels of the Phong material, in the order of the scene's material members.
enum PhongChannel : int {
    kPhongDiffuse,
    kPhongAmbient,
    kPhongTransparency,
    kPhongEmissive,
    kPhongSpecular,
    kPhongReflection,
    kPhongNormal,
    kPhongChannelCount
};

/// Everything a Phong material is made from.
struct PhongParameters {
    bool twosided = true;
    float primaryGIIntensity = 1.0f;
    float primaryGISaturation = 1.0f;
    float secondaryGIIntensity = 1.0f;
    float secondaryGISaturation = 1.0f;
    float diffuseGIBoost = 1.0f;
    float emissiveGIScale = 1.0f;
    float specularGIScale = 1.0f;
    bool diffuseAlphaAsTransparency = false;
    float shininess = 1.0f;
    MaterialChannel channels[kPhongChannelCount];
};

/// The evaluated channels of a material at one point, with the flags of how they were made.
/// The default answers are black colours and true flags.
class ShadingSampleInterface {
public:
    virtual ~ShadingSampleInterface() = default;
    virtual Color diffuse() const { return Color::black(); }
    virtual Color ambient() const { return Color::black(); }
    virtual Color transparency() const { return Color::black(); }
    virtual Color emissive() const { return Color::black(); }
    virtual Color specular() const { return Color::black(); }
    virtual Color reflection() const { return Color::black(); }
    /// The unit shading normal after the normal channel.
    virtual Vec3 normal() const { return {0, 0, 1}; }
    virtual float shininess() const { return 1.0f; }
    virtual bool twosided() const { return true; }
    /// True when a channel answers the same colour everywhere.
    virtual bool isDiffuseConstant() const { return true; }
    virtual bool isTransparencyConstant() const { return true; }
    virtual bool isNormalConstant() const { return true; }
};

/// The UV set a channel reads at a point: its own set when the point has it, else set 0.
inline int channelUvSet(const MaterialChannel &ch, const SurfacePoint &sp) {
    return ch.uvSet > 0 && uint32_t(ch.uvSet) < sp.uvSetCount &&
                   ch.uvSet < SurfacePoint::kMaxUvSets
               ? ch.uvSet
               : 0;
}

/// Colour of one channel at the context's point: source (vertex colour, texture or constant),
/// then scale (R, G, B), clamp, invert and swizzle.
inline Color evaluateChannel(const MaterialChannel &ch, const ShadingContext &ctx) {
    Color c;
    const SurfacePoint &sp = ctx.surface;
    if (ch.useVertexColor) {
        c = sp.color;
    } else if (ch.textureFile.empty()) {
        c = ch.color;
    } else if (!ch.texture) {
        c = Color(0, 0, 0, 1);
    } else {
        const SurfaceUv &s = sp.uvs[channelUvSet(ch, sp)];
        c = ch.texture->lookup(
            TextureLookup{s.uv.x, s.uv.y, s.dUVdx.x, s.dUVdx.y, s.dUVdy.x, s.dUVdy.y});
        // Float images may hold NaN or infinite texels: they read as opaque black.
        if (!std::isfinite(c.r + c.g + c.b + c.a)) c = Color(0, 0, 0, 1);
    }
    c.r *= ch.scale, c.g *= ch.scale, c.b *= ch.scale;
    if (ch.clamp) {
        for (float *v : {&c.r, &c.g, &c.b, &c.a}) *v = *v > 1.0f ? 1.0f : std::fmax(0.0f, *v);
    }
    if (ch.invert) c = Color(1.0f - c.r, 1.0f - c.g, 1.0f - c.b, 1.0f - c.a);
    if (ch.swizzle[0] != 255) {
        // Swizzle bytes are checked when the material is made: all of them lie in 0..3.
        const float in[4] = {c.r, c.g, c.b, c.a};
        c = Color(in[ch.swizzle[0] & 3], in[ch.swizzle[1] & 3], in[ch.swizzle[2] & 3],
                  in[ch.swizzle[3] & 3]);
    }
    return c;
}

/// The shading normal after a tangent-space normal colour (r, g, b in 0..1 meaning -1..1
/// along tangent, bitangent and normal). A degenerate result keeps the normal.
inline Vec3 applyNormalColor(const Color &c, const Vec3 &normal, const Vec3 &tangent,
                             const Vec3 &bitangent) {
    const float x = 2.0f * c.r - 1.0f, y = 2.0f * c.g - 1.0f, z = 2.0f * c.b - 1.0f;
    Vec3 n = tangent * x + bitangent * y + normal * z;
    const float l2 = n.lengthSquared();
    if (!(l2 > 1e-12f) || !std::isfinite(l2)) return normal;
    return n.normalize();
}

/// The Phong material evaluated at one point. Plain data: made on the stack per shading call.
class PhongShadingSample final : public ShadingSampleInterface {
public:
    /// Evaluates every channel of p at the context's point. The normal faces the side the ray
    /// came from when the material is two-sided.
    PhongShadingSample(const PhongParameters &p, const ShadingContext &ctx);

    Color diffuse() const override { return diffuse_; }
    Color ambient() const override { return ambient_; }
    /// Transparency in 0..1 per channel (diffuse alpha folded in when the material asks).
    Color transparency() const override { return transparency_; }
    Color emissive() const override { return emissive_; }
    Color specular() const override { return specular_; }
    Color reflection() const override { return reflection_; }
    Vec3 normal() const override { return normal_; }
    float shininess() const override { return params_.shininess; }
    bool twosided() const override { return params_.twosided; }
    bool isDiffuseConstant() const override { return params_.channels[kPhongDiffuse].isConstant(); }
    bool isTransparencyConstant() const override {
        return params_.channels[kPhongTransparency].isConstant() &&
               !(params_.diffuseAlphaAsTransparency && !isDiffuseConstant());
    }
    bool isNormalConstant() const override { return params_.channels[kPhongNormal].isConstant(); }
    /// The geometric normal on the side the shading normal faces.
    const Vec3 &geometricNormal() const { return geometricNormal_; }
    const PhongParameters &parameters() const { return params_; }

private:
    const PhongParameters &params_;
    Color diffuse_, ambient_, transparency_, emissive_, specular_, reflection_;
    Vec3 normal_, geometricNormal_;
};

/// The photon twin of a Phong material (registered as name + "_photon"): what a photon that
/// hits the surface keeps.
class PhongPhotonShader : public PhotonShaderInterface {
public:
    PhongPhotonShader(std::string name, const PhongParameters &parameters)
        : PhotonShaderInterface(std::move(name)), parameters_(parameters) {}
    /// The parameters of the material it belongs to.
    const PhongParameters &parameters() const { return parameters_; }
    /// Diffuse reflectance at the context's point (what a diffuse bounce keeps).
    Color diffuseReflectance(const ShadingContext &ctx) const {
        return evaluateChannel(parameters_.channels[kPhongDiffuse], ctx);
    }
    /// Specular reflectance at the context's point (what a mirror bounce keeps).
    Color specularReflectance(const ShadingContext &ctx) const {
        return evaluateChannel(parameters_.channels[kPhongReflection], ctx);
    }

private:
    PhongParameters parameters_;
};

/// Loads the texture of every channel that names a file (filter mode EWA). A texture that
/// cannot be made is reported ("Failed to create texture ..., it will be rendered as black")
/// and its channel answers opaque black.
void loadChannelTextures(const std::string &material, PhongParameters &p,
                         TextureFactory &textures);

/// Checks a material's values once, when it is made: non-finite numbers, swizzle bytes above
/// 3, negative shininess. Each fault is reported as one warning naming the material and
/// replaced by a safe value (the swizzle is dropped, the channel left unswizzled).
void validatePhongParameters(const std::string &name, PhongParameters &p);

}  // namespace ox

/// The Phong material made from a scene material.
class PhongShader : public ox::SurfaceShaderInterface {
public:
    /// The material; its values are validated (see validatePhongParameters).
    PhongShader(std::string name, const ox::PhongParameters &parameters);

    /// The stored parameters.
    const ox::PhongParameters &parameters() const { return parameters_; }
    /// True when a channel names a UV set of its own (the material then needs a variant per
    /// set of shape UV-set names).
    bool hasUvOverrides() const;
    /// The UV set of every channel on a shape with these UV-set names (-1 where the channel has
    /// no override or the shape has no set of that name).
    std::vector<int32_t> resolveUvSets(const std::vector<std::string> &uvSetNames) const;
    /// The name of the variant for these resolved sets: the material name, "|uv" and the sets.
    std::string variantName(const std::vector<int32_t> &sets) const;

    /// Full Phong shading under the context's component mask: ambient, incandescence and
    /// indirect light, diffuse and specular from every linked light, reflections and
    /// refractions, the opaque part weighted by (1 - transparency).
    ox::Color shade(ox::ShadingContext &ctx) const override;
    /// luminance(shadowed) / luminance(unshadowed) direct light, 1 where no light arrives.
    ox::Color shadow(ox::ShadingContext &ctx) const override;
    /// The transparency colour.
    ox::Color transmission(ox::ShadingContext &ctx) const override;
    /// The diffuse colour times the context's colour weight (alpha: the weight's alpha).
    ox::Color albedo(ox::ShadingContext &ctx) const override;

private:
    ox::PhongParameters parameters_;
};

/// A Phong material whose textures use the UV sets resolved for one kind of shape.
class PhongShaderUVOverride : public PhongShader {
public:
    /// A copy of base under `name` with every channel's UV set from `sets`.
    PhongShaderUVOverride(std::string name, const PhongShader &base,
                          const std::vector<int32_t> &sets);
};
