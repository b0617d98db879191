// The settings catalogue as a user meets it: the default file, files that set a few keys, bad
// names and numbers, and bake targets read from their entries.
#include <gtest/gtest.h>

#include <sstream>
#include <vector>

#include "config/ox_config.h"
#include "config/xml.h"
#include "core/message.h"
#include "tests/config/test_settings.h"

using testing::internal::CaptureStdout;
using testing::internal::GetCapturedStdout;

namespace {

std::vector<std::string> lines(const std::string &text) {
    std::vector<std::string> out;
    std::istringstream in(text);
    for (std::string l; std::getline(in, l);) out.push_back(l);
    return out;
}

/// The text between <name> and </name> after the first "<section>".
std::string valueIn(const std::string &xml, const std::string &section, const std::string &name) {
    const size_t s = xml.find("<" + section + ">");
    if (s == std::string::npos) return "<no section>";
    const size_t b = xml.find("<" + name + ">", s);
    const size_t e = xml.find("</" + name + ">", b);
    if (b == std::string::npos || e == std::string::npos) return "<no key>";
    return xml.substr(b + name.size() + 2, e - b - name.size() - 2);
}

/// Loads `document` into `config`, returning what it printed.
std::string load(const std::string &document, ox::OXConfigBase &config) {
    ox::resetMessageFilters();
    CaptureStdout();
    EXPECT_TRUE(ox::loadSettingsFromMemory(document, config));
    return GetCapturedStdout();
}

}  // namespace

TEST(Catalog, DefaultFileHoldsTheElevenObjectsAndTheDocumentedDefaults) {
    const ox::OXConfig config;
    std::vector<std::string> keys;
    for (const auto &m : config.members()) keys.emplace_back(m.key());
    EXPECT_EQ(keys, (std::vector<std::string>{
                        "AASettings", "ADSSettings", "AOSettings", "EnvironmentSettings",
                        "FrameSettings", "GISettings", "PointCloudBakeSettings", "RenderSettings",
                        "SurfaceTransferSettings", "TextureBakeSettings", "VertexBakeSettings"}));

    const std::string xml = cfgtest::xmlOf(config);
    EXPECT_NE(xml.find("<resolution>\n\t\t\t<x>640</x>\n\t\t\t<y>480</y>\n\t\t</resolution>"),
              std::string::npos);
    EXPECT_EQ(valueIn(xml, "RenderSettings", "maxShadowRays"), "4294967295");
    EXPECT_EQ(valueIn(xml, "GISettings", "fgMaxMovement"), "1e+06");
    EXPECT_EQ(valueIn(xml, "EnvironmentSettings", "iblImageFile"), "-");
    // The point-cloud Lua settings stand under their key, not under their type name.
    EXPECT_EQ(valueIn(xml, "PointCloudBakeComponents", "outputType"), "Mono");
    EXPECT_EQ(xml.find("PCLuaSettings"), std::string::npos);
    // Every vector starts empty.
    EXPECT_NE(xml.find("<targets/>"), std::string::npos);
    EXPECT_EQ(xml.find("<element>"), std::string::npos);
}

TEST(Catalog, KeysSetInAFileChangeExactlyThoseLinesAndBadOnesNothing) {
    const std::string defaults = cfgtest::xmlOf(ox::OXConfig());
    ox::OXConfig config;
    const std::string printed = load(R"(<?xml version="1.0"?>
<OXConfig>
  <FrameSettings><renderType> TextureBake
  </renderType></FrameSettings>
  <AASettings><filter>Mitchell</filter><samplingMode>Progressive</samplingMode>
    <minSampleRate>lots</minSampleRate></AASettings>
  <RenderSettings><motionBlur>2d</motionBlur></RenderSettings><FrameSettngs/>
  <GISettings><ptDefaultColor><r>1</r><g>0.5</g><b>0.25</b></ptDefaultColor></GISettings>
  <TextureBakeSettings><Normalize><normalizeRange>MinMax</normalizeRange></Normalize>
  </TextureBakeSettings>
  <EnvironmentSettings><iblSwapYZ>1</iblSwapYZ></EnvironmentSettings>
  <VertexBakeSettings><VertexBakeSamplingOptions><MaxSamples>16</MaxSamples>
  </VertexBakeSamplingOptions></VertexBakeSettings>
  <PointCloudBakeSettings><PointCloudBakeComponents><LUASettings><outputType>RGB</outputType>
  </LUASettings></PointCloudBakeComponents></PointCloudBakeSettings>
</OXConfig>)",
                                     config);
    EXPECT_EQ(printed,
              "[WARNING]  Warning, could not set value Progressive for enum samplingMode\n"
              "[WARNING]  Type conversion error when assigning value lots\n"
              "[WARNING]  Warning, could not set value 2d for enum motionBlur\n"
              "[WARNING]  Warning, unknown node: FrameSettngs\n");
    const auto before = lines(defaults);
    const auto after = lines(cfgtest::xmlOf(config));
    ASSERT_EQ(before.size(), after.size());
    std::vector<std::string> changed;
    for (size_t i = 0; i < before.size(); ++i)
        if (before[i] != after[i]) changed.push_back(after[i]);
    EXPECT_EQ(changed, (std::vector<std::string>{
                           "\t\t<filter>Mitchell</filter>",
                           "\t\t<iblSwapYZ>true</iblSwapYZ>",
                           "\t\t<renderType>TextureBake</renderType>",
                           "\t\t\t<r>1</r>",
                           "\t\t\t<g>0.5</g>",
                           "\t\t\t<b>0.25</b>",
                           "\t\t\t\t<outputType>RGB</outputType>",
                           "\t\t\t<normalizeRange>MinMax</normalizeRange>",
                           "\t\t\t<MaxSamples>16</MaxSamples>",
                       }));
    EXPECT_EQ(config.FrameSettings.renderType(), ox::RenderType::TextureBake);
    // Enumeration names match exactly: "2D" and "3D" are names, not identifiers.
    EXPECT_TRUE(config.RenderSettings.motionBlur.setFromString("3D"));
    EXPECT_EQ(config.RenderSettings.motionBlur(), ox::MotionBlurMode::Blur3D);
}

TEST(Catalog, BakeTargetsSurfacesAndLightPassesReadFromElementEntries) {
    ox::OXConfig config;
    EXPECT_EQ(load(R"(<OXConfig><TextureBakeSettings><targets>
  <element><textureName>floor</textureName><hasResolutionOverride>true</hasResolutionOverride>
    <resolutionOverride><x>256</x><y>128</y></resolutionOverride><targetSurfaces>
      <element><target>floorShape</target><name>a</name>
        <UVScale><x>2</x><y>1</y></UVScale></element>
      <BakeShape><target>rug</target></BakeShape></targetSurfaces></element></targets>
  <RenderComponents><fullShading>true</fullShading>
    <lightPass><element><bakeType>LightMap</bakeType>
      <lights><element>sun</element><element>lamp</element></lights></element></lightPass>
    <customPasses><element>ambientOcclusion</element></customPasses></RenderComponents>
</TextureBakeSettings></OXConfig>)",
                   config),
              "");
    const ox::TextureBakeSettingsBase &bake = config.TextureBakeSettings;
    ASSERT_EQ(bake.targets.size(), 1u);
    const ox::BakeTextureTargetBase &target = bake.targets[0];
    EXPECT_EQ(target.textureName(), "floor");
    EXPECT_EQ(target.resolutionOverride(), ox::Vec2i(256, 128));
    ASSERT_EQ(target.targetSurfaces.size(), 2u);
    EXPECT_EQ(target.targetSurfaces[0].target(), "floorShape");
    EXPECT_EQ(target.targetSurfaces[0].name(), "a");
    EXPECT_EQ(target.targetSurfaces[0].UVScale(), ox::Vec2(2, 1));
    EXPECT_EQ(target.targetSurfaces[1].target(), "rug");
    EXPECT_EQ(target.targetSurfaces[1].UVScale(), ox::Vec2(1, 1));
    ASSERT_EQ(bake.RenderComponents.lightPass.size(), 1u);
    EXPECT_EQ(bake.RenderComponents.lightPass[0].bakeType(), ox::LightPassType::LightMap);
    EXPECT_EQ(bake.RenderComponents.lightPass[0].lights.values(),
              (std::vector<std::string>{"sun", "lamp"}));
    EXPECT_EQ(bake.RenderComponents.customPasses.values(),
              std::vector<std::string>{"ambientOcclusion"});
}
