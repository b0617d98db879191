#pragma once

#include <cstdint>
#include <string>

#include "config/type.h"
#include "core/types.h"

/// Settings of the acceleration structure.
namespace ox {

/// Enumeration "AdsType".
enum class AdsType : int32_t { CompleteGrid };
OX_ENUM_NAMES(AdsType, "AdsType", "CompleteGrid");

/// Enumeration "UseInstancing".
enum class InstancingType : int32_t { Never, AutoDetect, Always };
OX_ENUM_NAMES(InstancingType, "UseInstancing", "Never", "AutoDetect", "Always");

/// Acceleration grid settings (type "ADSSettings").
class ADSSettingsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    ADSSettingsBase();

    OXCEnum<AdsType> adsAlgorithm{this, "adsAlgorithm", AdsType::CompleteGrid,
                                  "ADSAlgorithm to use. Currently only CompleteGrid is enabled"};
    OXCType<bool> memLimitEnabled{this, "memLimitEnabled", false, "Not relevant for Vorn"};
    OXCType<uint32_t> memLimit{this, "memLimit", 400u, nullptr};
    OXCType<uint32_t> gridMaxDepth{this, "gridMaxDepth", 4u, "Max recursion depth in grid"};
    OXCType<uint32_t> gridThreshold{this, "gridThreshold", 25u, "Maximum primitives per cell"};
    OXCType<float> gridDensity{this, "gridDensity", 1.0f, "Sets the density for the grid"};
    OXCType<bool> useSSE{this, "useSSE", true, "Use SSE for intersection tests"};
    OXCEnum<InstancingType> useInstancing{
        this, "useInstancing", InstancingType::AutoDetect,
        "Selects how to use geometry instancing (0=Never, 1=AutoDetect)"};
    OXCType<uint32_t> instancingThreshold{
        this, "instancingThreshold", 500u,
        "Specifies the minimum number of triangles that an instance is allowed to have in order "
        "for geometry instancing to be used."};
};

}  // namespace ox
