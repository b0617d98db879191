#include "config/settings_gi.h"

namespace ox {

GISettingsBase::GISettingsBase() : OXCComplexType("GISettings") {}
AOSettingsBase::AOSettingsBase() : OXCComplexType("AOSettings") {}

}  // namespace ox
