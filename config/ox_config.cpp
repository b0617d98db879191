#include "config/ox_config.h"

namespace ox {

OXConfigBase::OXConfigBase() : OXCComplexType("OXConfig") {}

}  // namespace ox
