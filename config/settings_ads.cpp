#include "config/settings_ads.h"

namespace ox {

ADSSettingsBase::ADSSettingsBase() : OXCComplexType("ADSSettings") {}

}  // namespace ox
