#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "shading/shader.h"

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

/// The photon twin of a Phong material (registered as name + "_photon").
class PhongPhotonShader : public PhotonShaderInterface {
public:
    PhongPhotonShader(std::string name, const PhongParameters &parameters)
        : PhotonShaderInterface(std::move(name)), parameters_(parameters) {}
    /// The parameters of the material it belongs to.
    const PhongParameters &parameters() const { return parameters_; }

private:
    PhongParameters parameters_;
};

}  // namespace ox

/// The Phong material made from a scene material.
class PhongShader : public ox::SurfaceShaderInterface {
public:
    PhongShader(std::string name, const ox::PhongParameters &parameters)
        : SurfaceShaderInterface(std::move(name)), parameters_(parameters) {}

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
