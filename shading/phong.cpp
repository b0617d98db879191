#include "shading/phong.h"

namespace {

ox::PhongParameters withSets(const ox::PhongParameters &p, const std::vector<int32_t> &sets) {
    ox::PhongParameters out = p;
    for (int c = 0; c < ox::kPhongChannelCount && c < int(sets.size()); ++c)
        out.channels[c].uvSet = sets[size_t(c)];
    return out;
}

}  // namespace

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
