#include "config/settings_vertex.h"

namespace ox {

VertexBakeComponentsBase::VertexBakeComponentsBase() : OXCComplexType("VertexBakeComponents") {}
VertexBakeSamplingOptionsBase::VertexBakeSamplingOptionsBase()
    : OXCComplexType("VertexBakeSamplingOptions") {}
VertexBakeSettingsBase::VertexBakeSettingsBase() : OXCComplexType("VertexBakeSettings") {}

}  // namespace ox
