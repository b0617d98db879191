#include "scene/material_converter.h"

namespace ox {

PhongParameters ZPXMaterialConverter::parameters(const XMLMaterialCompact &r) {
    PhongParameters p;
    p.twosided = r.twosided;
    p.primaryGIIntensity = r.primaryGIIntensity;
    p.primaryGISaturation = r.primaryGISaturation;
    p.secondaryGIIntensity = r.secondaryGIIntensity;
    p.secondaryGISaturation = r.secondaryGISaturation;
    p.diffuseGIBoost = r.diffuseGIBoost;
    p.emissiveGIScale = r.emissiveGIScale;
    p.specularGIScale = r.specularGIScale;
    p.diffuseAlphaAsTransparency = r.diffuseAlphaAsTransparency;
    p.shininess = r.shininess;
    for (int c = 0; c < kPhongChannelCount; ++c) {
        const XMLTextureBlockCompact &b = r.channels[c];
        MaterialChannel &ch = p.channels[c];
        ch.useVertexColor = b.useVertexColor;
        ch.scale = b.scale;
        ch.color = b.color;
        ch.textureFile = b.fileTexture;
        ch.uvLayerOverride = b.uvLayerOverride;
    }
    return p;
}

std::unique_ptr<Material> makePhongMaterial(std::unique_ptr<PhongShader> shader) {
    auto photon =
        std::make_unique<PhongPhotonShader>(shader->name() + "_photon", shader->parameters());
    return std::make_unique<Material>(std::move(shader), std::move(photon));
}

std::unique_ptr<Material> ZPXMaterialConverter::convert(const XMLMaterialCompact &record) const {
    PhongParameters p = parameters(record);
    if (textures_) loadChannelTextures(record.name, p, *textures_);
    return makePhongMaterial(std::make_unique<PhongShader>(record.name, p));
}

const Material *SceneMaterialResolver::resolve(const std::string &name,
                                               const std::vector<std::string> &uvSetNames) {
    const Material *base = table_.find(name);
    if (!base) return nullptr;
    const auto *phong = dynamic_cast<const PhongShader *>(&base->surface());
    if (!phong || !phong->hasUvOverrides()) return base;
    const std::vector<int32_t> sets = phong->resolveUvSets(uvSetNames);
    const std::string variant = phong->variantName(sets);
    return table_.findOrInsert(variant, [&] {
        return makePhongMaterial(std::make_unique<PhongShaderUVOverride>(variant, *phong, sets));
    });
}

}  // namespace ox
