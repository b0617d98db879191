#pragma once

#include "config/settings_ads.h"
#include "config/settings_bake.h"
#include "config/settings_frame.h"
#include "config/settings_gi.h"
#include "config/settings_pointcloud.h"
#include "config/settings_render.h"
#include "config/settings_transfer.h"
#include "config/settings_vertex.h"
#include "config/type.h"

/// The root of the configuration tree: one object of each settings class.
namespace ox {

/// The configuration (type "OXConfig"). Its eleven settings objects are registered under their
/// type names, so the file lists them in ascending name order whatever the order below.
class OXConfigBase : public OXCComplexType {
public:
    /// A configuration with every default.
    OXConfigBase();

    OXCNested<FrameSettingsBase> FrameSettings{this, "", "Frame settings"};
    OXCNested<AASettingsBase> AASettings{this, "", "Antialiasing settings"};
    OXCNested<ADSSettingsBase> ADSSettings{this, "", "Acceleration structure settings"};
    OXCNested<GISettingsBase> GISettings{this, "", "Global illumination settings"};
    OXCNested<RenderSettingsBase> RenderSettings{this, "", "Render settings"};
    OXCNested<AOSettingsBase> AOSettings{this, "", "Ambient occlusion settings"};
    OXCNested<TextureBakeSettingsBase> TextureBakeSettings{this, "", "Texture bake settings"};
    OXCNested<EnvironmentSettingsBase> EnvironmentSettings{this, "", "Environment settings"};
    OXCNested<SurfaceTransferSettingsBase> SurfaceTransferSettings{this, "",
                                                                   "Surface transfer settings"};
    OXCNested<VertexBakeSettingsBase> VertexBakeSettings{this, "", "Vertex bake settings"};
    OXCNested<PointCloudBakeSettingsBase> PointCloudBakeSettings{this, "",
                                                                 "Point cloud bake settings"};
};

/// The configuration as a concrete, clonable value.
using OXConfig = OXCComplexTypeInstantiator<OXConfigBase>;

}  // namespace ox
