#include "config/settings_bake.h"

namespace ox {

BakeShapeBase::BakeShapeBase() : OXCComplexType("BakeShape") {}
BakeTextureTargetBase::BakeTextureTargetBase() : OXCComplexType("BakeTextureTarget") {}
RNMSettingsBase::RNMSettingsBase() : OXCComplexType("RNMSettings") {}
NormalizationBase::NormalizationBase() : OXCComplexType("Normalize") {}
LUASettingsBase::LUASettingsBase() : OXCComplexType("LUASettings") {}
LightPassEntryBase::LightPassEntryBase() : OXCComplexType("LightPassEntry") {}
LightPassSettingsBase::LightPassSettingsBase() : OXCComplexType("LightPassSettings") {}
FullAndIndirectIlluminationSettingsBase::FullAndIndirectIlluminationSettingsBase()
    : OXCComplexType("FullAndIndirectIlluminationSettings") {}
RenderComponentsBase::RenderComponentsBase() : OXCComplexType("RenderComponents") {}
TextureBakeSettingsBase::TextureBakeSettingsBase() : OXCComplexType("TextureBakeSettings") {}

}  // namespace ox
