#pragma once

#include <cstdint>
#include <string>

#include "config/type.h"
#include "core/types.h"

/// Point-cloud bake settings: targets, light links and components.
namespace ox {

/// Enumeration "PCOutputType".
enum class PCOutputType : int32_t { Mono, RGB };
OX_ENUM_NAMES(PCOutputType, "PCOutputType", "Mono", "RGB");

/// Enumeration "PCSource".
enum class PCSource : int32_t { PointCloudFile, Shape };
OX_ENUM_NAMES(PCSource, "PCSource", "PointCloudFile", "Shape");

/// Enumeration "LightLinkMode".
enum class LightLinkMode : int32_t { Including, Excluding };
OX_ENUM_NAMES(LightLinkMode, "LightLinkMode", "Including", "Excluding");

/// Script and output kind of the point-cloud Lua pass (type "PCLuaSettings").
class PCLuaSettingsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    PCLuaSettingsBase();

    OXCType<std::string> scriptFile{this, "scriptFile", "", "LUA script file to use for baking"};
    OXCEnum<PCOutputType> outputType{
        this, "outputType", PCOutputType::Mono,
        "Whether LUA output is monocrome or RGB (determines how the data is stored to file)"};
};

/// Lights included in or excluded from one point-cloud target (type "LightLinks").
class LightLinksBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    LightLinksBase();

    OXCType<bool> enabled{
        this, "enabled", false,
        "Should these light-links be used for this bake target? If false, light-links can still be "
        "inherited from the input shape if sourceType is a Shape."};
    OXCEnum<LightLinkMode> mode{this, "mode", LightLinkMode::Including,
                                "Whether the specified lights should be included or excluded."};
    OXCTypedVector<std::string> lights{this, "lights",
                                       "A vector of lights that should be included or excluded."};
};

/// One point-cloud bake target: point source and output file (type "PCBakeTarget").
class PCBakeTargetBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    PCBakeTargetBase();

    OXCType<std::string> input{this, "input", "", "File or shape name to use as point source"};
    OXCType<std::string> outputFile{this, "outputFile", "", "Name of output file"};
    OXCEnum<PCSource> sourceType{this, "sourceType", PCSource::PointCloudFile,
                                 "Whether source (input) is file or shape name"};
    OXCNested<LightLinksBase> LightLinks{this, "", "Light Links for this target."};
};

/// The values a point-cloud bake computes (type "PointCloudBakeComponents").
class PointCloudBakeComponentsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    PointCloudBakeComponentsBase();

    OXCType<bool> illumination{this, "illumination", false, "Bake incoming light"};
    OXCType<bool> indirectIllumination{this, "indirectIllumination", false,
                                       "Bake incoming indirect illumination"};
    OXCType<bool> fullAndIndirectIllumination{this, "fullAndIndirectIllumination", false,
                                              "Bake direct+indirect and indirect"};
    OXCType<bool> lua{this, "lua", false, "Bake LUA pass"};
    OXCNested<PCLuaSettingsBase> LUASettings{this, "LUASettings",
                                             "LUA settings. Only valid if lua = true"};
};

/// Point-cloud bake settings (type "PointCloudBakeSettings").
class PointCloudBakeSettingsBase : public OXCComplexType {
public:
    /// All members with their defaults, registered under their keys.
    PointCloudBakeSettingsBase();

    OXCTypedComplexVector<PCBakeTargetBase> targets{this, "targets", "Targets to bake"};
    OXCNested<PointCloudBakeComponentsBase> PointCloudBakeComponents{
        this, "", "Specifies what components to bake"};
};

}  // namespace ox
