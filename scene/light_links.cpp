#include "scene/light_links.h"

#include <unordered_map>

#include "core/message.h"

namespace ox {
namespace {

std::unordered_map<std::string, uint32_t> indexByName(const std::vector<LightLinkEntry> &entries) {
    std::unordered_map<std::string, uint32_t> map;
    map.reserve(entries.size());
    for (uint32_t i = 0; i < entries.size(); ++i)
        if (entries[i].named) map.try_emplace(entries[i].name, i);
    return map;
}

}  // namespace

void LightLinkTable::invertRow(uint32_t i) {
    uint64_t *r = &bits_[size_t(i) * stride_];
    for (size_t w = 0; w < stride_; ++w) r[w] = ~r[w];
    // Bits beyond the last light stay clear.
    if (lights_ % 64 != 0) r[stride_ - 1] &= (uint64_t(1) << (lights_ % 64)) - 1;
}

void LightLinkTable::build(const std::vector<LightLinkEntry> &instances,
                           const std::vector<LightLinkEntry> &lights) {
    instances_ = static_cast<uint32_t>(instances.size());
    lights_ = static_cast<uint32_t>(lights.size());
    stride_ = (size_t(lights_) + 63) / 64;
    bits_.assign(size_t(instances_) * stride_, 0);
    const auto lightIndex = indexByName(lights);
    const auto instanceIndex = indexByName(instances);

    for (uint32_t i = 0; i < instances_; ++i) {
        const LightLinkEntry &inst = instances[i];
        if (inst.mode != LinkMode::kInclusive && inst.mode != LinkMode::kExclusive) continue;
        for (const std::string &name : inst.links) {
            auto it = lightIndex.find(name);
            if (it == lightIndex.end())
                message(kMsgWarning, 6, "Light linked light %s not present", name.c_str());
            else
                set(i, it->second);
        }
        if (inst.mode == LinkMode::kExclusive && lights_ > 0) invertRow(i);
    }

    for (uint32_t l = 0; l < lights_; ++l) {
        const LightLinkEntry &light = lights[l];
        switch (light.mode) {
            case LinkMode::kInclusive:
            case LinkMode::kExclusive: {
                const bool exclusive = light.mode == LinkMode::kExclusive;
                if (exclusive)
                    for (uint32_t i = 0; i < instances_; ++i) flip(i, l);
                for (const std::string &name : light.links) {
                    auto it = instanceIndex.find(name);
                    if (it == instanceIndex.end())
                        message(kMsgWarning, 6, "Light linked instance %s not present",
                                name.c_str());
                    else
                        set(it->second, l);
                }
                if (exclusive)
                    for (uint32_t i = 0; i < instances_; ++i) flip(i, l);
                break;
            }
            case LinkMode::kNone:
            default:
                for (uint32_t i = 0; i < instances_; ++i)
                    if (instances[i].mode == LinkMode::kNone) set(i, l);
                break;
        }
    }
}

}  // namespace ox
