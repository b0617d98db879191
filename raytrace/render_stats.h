#pragma once

#include <cstdint>

namespace ox {

/// Bits of an instance's 32-bit flag word, built from the scene's RenderStats booleans.
struct RenderStats {
    static constexpr uint32_t kPrimaryVisibility = 0x1;
    static constexpr uint32_t kCastShadows = 0x2;
    static constexpr uint32_t kReceiveShadows = 0x4;
    static constexpr uint32_t kMotionBlur = 0x8;
    static constexpr uint32_t kSmoothShading = 0x10;
    static constexpr uint32_t kVisibleInReflections = 0x20;
    static constexpr uint32_t kVisibleInRefractions = 0x40;
    static constexpr uint32_t kVisibleInFG = 0x80;
    static constexpr uint32_t kDoubleSided = 0x100;
    static constexpr uint32_t kOpposite = 0x200;
    static constexpr uint32_t kCastGI = 0x400;
    static constexpr uint32_t kReceiveGI = 0x800;
    static constexpr uint32_t kStaticGI = 0x1000;
    static constexpr uint32_t kSmoothGI = 0x2000;
    static constexpr uint32_t kCastOcclusion = 0x4000;
    static constexpr uint32_t kReceiveOcclusion = 0x8000;
    static constexpr uint32_t kEnvelop = 0x10000;
    static constexpr uint32_t kIsImagePlane = 0x20000;
    static constexpr uint32_t kSelfOcclusion = 0x40000;
    static constexpr uint32_t kShadowBias = 0x80000;

    /// The flag word of an instance whose RenderStats element keeps all defaults.
    static constexpr uint32_t kDefault =
        kPrimaryVisibility | kCastShadows | kReceiveShadows | kSelfOcclusion | kMotionBlur |
        kSmoothShading | kVisibleInReflections | kVisibleInRefractions | kVisibleInFG |
        kDoubleSided | kCastGI | kReceiveGI | kSmoothGI | kCastOcclusion | kReceiveOcclusion;
};

}  // namespace ox
