#include "config/settings_pointcloud.h"

namespace ox {

PCLuaSettingsBase::PCLuaSettingsBase() : OXCComplexType("PCLuaSettings") {}
LightLinksBase::LightLinksBase() : OXCComplexType("LightLinks") {}
PCBakeTargetBase::PCBakeTargetBase() : OXCComplexType("PCBakeTarget") {}
PointCloudBakeComponentsBase::PointCloudBakeComponentsBase()
    : OXCComplexType("PointCloudBakeComponents") {}
PointCloudBakeSettingsBase::PointCloudBakeSettingsBase()
    : OXCComplexType("PointCloudBakeSettings") {}

}  // namespace ox
