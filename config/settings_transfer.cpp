#include "config/settings_transfer.h"

namespace ox {

UVPackTextureSettingsBase::UVPackTextureSettingsBase() : OXCComplexType("UVPackSettings") {}
UVPackTargetSettingsBase::UVPackTargetSettingsBase() : OXCComplexType("UVPackTargetSettings") {}
RangeRemapSettingsBase::RangeRemapSettingsBase() : OXCComplexType("RangeRemapSettings") {}
SurfaceTransferTargetBase::SurfaceTransferTargetBase() : OXCComplexType("SurfaceTransferTarget") {}
SurfaceTransferTextureBase::SurfaceTransferTextureBase()
    : OXCComplexType("SurfaceTransferTexture") {}
SurfaceTransferSettingsBase::SurfaceTransferSettingsBase()
    : OXCComplexType("SurfaceTransferSettings") {}

}  // namespace ox
