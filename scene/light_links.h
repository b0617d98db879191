#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace ox {

/// How an instance or a light restricts light linking (the scene's LightLinkMode) ("INCLUSIVE" 0,
/// "EXCLUSIVE" 1, "NONE" 2).
enum class LinkMode : int32_t { kInclusive = 0, kExclusive = 1, kNone = 2 };

/// The link settings of one instance (its light names) or one light (its instance names).
struct LightLinkEntry {
    std::string name;
    LinkMode mode = LinkMode::kNone;
    std::vector<std::string> links;
    /// False for lights the system made itself (they share names): link lists cannot name them.
    bool named = true;
};

/// Which light reaches which instance: one bit row per instance (scene order), one bit per light
/// (scene order).
class LightLinkTable {
public:
    /// Builds the table from the instances' and the lights' link settings; names that match
    /// nothing are warned about ("Light linked light %s not present", "Light linked instance %s
    /// not present") and ignored. Names are matched to the first entry of that name.
    void build(const std::vector<LightLinkEntry> &instances,
               const std::vector<LightLinkEntry> &lights);

    /// True when the light reaches the instance.
    bool reaches(uint32_t instance, uint32_t light) const {
        return (bits_[size_t(instance) * stride_ + light / 64] >> (light % 64)) & 1u;
    }
    /// The bit row of an instance (bit j of word j / 64 for light j).
    const uint64_t *row(uint32_t instance) const { return &bits_[size_t(instance) * stride_]; }
    uint32_t instanceCount() const { return instances_; }
    uint32_t lightCount() const { return lights_; }
    /// Bytes held by the bit rows.
    size_t sizeBytes() const { return bits_.size() * sizeof(uint64_t); }

private:
    void set(uint32_t i, uint32_t l) {
        bits_[size_t(i) * stride_ + l / 64] |= uint64_t(1) << (l % 64);
    }
    void flip(uint32_t i, uint32_t l) {
        bits_[size_t(i) * stride_ + l / 64] ^= uint64_t(1) << (l % 64);
    }
    void invertRow(uint32_t i);

    uint32_t instances_ = 0, lights_ = 0;
    size_t stride_ = 0;
    std::vector<uint64_t> bits_;
};

}  // namespace ox
