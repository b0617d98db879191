#include "config/settings_render.h"

namespace ox {

AASettingsBase::AASettingsBase() : OXCComplexType("AASettings") {}
RenderSettingsBase::RenderSettingsBase() : OXCComplexType("RenderSettings") {}
EnvironmentSettingsBase::EnvironmentSettingsBase() : OXCComplexType("EnvironmentSettings") {}

}  // namespace ox
