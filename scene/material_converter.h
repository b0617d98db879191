#pragma once

#include <memory>
#include <string>
#include <vector>

#include "core/types.h"
#include "scene/scene_elements.h"
#include "scene/temp_shape.h"
#include "shading/material.h"
#include "shading/phong.h"

namespace ox {

/// Turns the scene's materials into shaders: a Phong shader with its photon twin
/// (name + "_photon") per material, and per shape the variant whose textures use the shape's
/// UV sets named by the material (UVLayerOverride).
class ZPXMaterialConverter {
public:
    /// A converter for a scene of this box; channel textures load through textures (none are
    /// loaded without it).
    explicit ZPXMaterialConverter(const BBox &sceneBox, TextureFactory *textures = nullptr)
        : sceneBox_(sceneBox), textures_(textures) {}

    /// The Phong parameters of a material record.
    static PhongParameters parameters(const XMLMaterialCompact &record);
    /// The material (Phong shader and photon twin) of a record.
    std::unique_ptr<Material> convert(const XMLMaterialCompact &record) const;
    /// The scene box given at construction.
    const BBox &sceneBox() const { return sceneBox_; }

private:
    BBox sceneBox_;
    TextureFactory *textures_;
};

/// Registers a material made of a surface shader and its photon twin (name + "_photon").
std::unique_ptr<Material> makePhongMaterial(std::unique_ptr<PhongShader> shader);

/// Resolves material names for shapes through the scene's material table, registering the
/// shape variants of materials with UV-set overrides once (thread-safe).
class SceneMaterialResolver final : public ShapeMaterialResolverInterface {
public:
    explicit SceneMaterialResolver(MaterialTable &table) : table_(table) {}
    const Material *resolve(const std::string &name,
                            const std::vector<std::string> &uvSetNames) override;

private:
    MaterialTable &table_;
};

}  // namespace ox
