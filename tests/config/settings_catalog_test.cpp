// The settings catalogue as a user meets it: the default file, the schema, round trips, and files
// that set a few keys.
#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <set>
#include <sstream>
#include <vector>

#include "config/ox_config.h"
#include "config/settings_checks.h"
#include "config/xml.h"
#include "core/message.h"

using testing::internal::CaptureStdout;
using testing::internal::GetCapturedStdout;
namespace fs = std::filesystem;

namespace {

std::string written(const ox::OXCTypeBase &root) {
    std::string out;
    EXPECT_TRUE(ox::writeSettingsToString(out, root));
    return out;
}

std::vector<std::string> lines(const std::string &text) {
    std::vector<std::string> out;
    std::istringstream in(text);
    for (std::string l; std::getline(in, l);) out.push_back(l);
    return out;
}

std::string readFile(const fs::path &p) {
    std::ifstream in(p, std::ios::binary);
    std::stringstream ss;
    ss << in.rdbuf();
    return ss.str();
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
    CaptureStdout();
    EXPECT_TRUE(ox::loadSettingsFromMemory(document, config));
    return GetCapturedStdout();
}

class Catalog : public testing::Test {
protected:
    void SetUp() override {
        ox::resetMessageFilters();
        dir_ = fs::temp_directory_path() /
               ("oxcat_" + std::to_string(::getpid()) + "_" +
                testing::UnitTest::GetInstance()->current_test_info()->name());
        fs::remove_all(dir_);
        fs::create_directories(dir_);
    }
    void TearDown() override { fs::remove_all(dir_); }
    fs::path dir_;
};

}  // namespace

TEST_F(Catalog, DefaultFileHoldsTheElevenObjectsAndTheDocumentedDefaults) {
    const ox::OXConfig config;
    EXPECT_EQ(config.typeName(), "OXConfig");
    std::vector<std::string> keys;
    for (const auto &m : config.members()) keys.emplace_back(m.key());
    EXPECT_EQ(keys, (std::vector<std::string>{
                        "AASettings", "ADSSettings", "AOSettings", "EnvironmentSettings",
                        "FrameSettings", "GISettings", "PointCloudBakeSettings", "RenderSettings",
                        "SurfaceTransferSettings", "TextureBakeSettings", "VertexBakeSettings"}));
    EXPECT_EQ(config.GISettings.members().size(), 111u);

    const std::string xml = written(config);
    EXPECT_EQ(valueIn(xml, "FrameSettings", "renderThreads"), "2");
    EXPECT_EQ(valueIn(xml, "FrameSettings", "autoThreads"), "true");
    EXPECT_EQ(valueIn(xml, "FrameSettings", "cameraName"), "persp");
    EXPECT_EQ(valueIn(xml, "FrameSettings", "imageFormat"), "TGA");
    EXPECT_NE(xml.find("<resolution>\n\t\t\t<x>640</x>\n\t\t\t<y>480</y>\n\t\t</resolution>"),
              std::string::npos);
    EXPECT_EQ(valueIn(xml, "RenderSettings", "maxShadowRays"), "4294967295");
    EXPECT_EQ(valueIn(xml, "RenderSettings", "maxGlossyRays"), "4294967295");
    EXPECT_EQ(valueIn(xml, "RenderSettings", "motionBlur"), "Off");
    EXPECT_EQ(valueIn(xml, "GISettings", "fgMaxMovement"), "1e+06");
    EXPECT_EQ(valueIn(xml, "EnvironmentSettings", "iblImageFile"), "-");
    // The point-cloud Lua settings stand under their key, not under their type name.
    EXPECT_EQ(valueIn(xml, "PointCloudBakeComponents", "outputType"), "Mono");
    EXPECT_EQ(xml.find("PCLuaSettings"), std::string::npos);
    // Every vector starts empty.
    EXPECT_NE(xml.find("<targets/>"), std::string::npos);
    EXPECT_EQ(xml.find("<element>"), std::string::npos);
}

TEST_F(Catalog, WrittenDefaultsReadBackToTheSameFileWithoutAWord) {
    const ox::OXConfig defaults;
    const std::string text = written(defaults);
    ox::OXConfig config;
    EXPECT_EQ(load(text, config), "");  // no unknown node, no bad value
    EXPECT_EQ(written(config), text);
    EXPECT_EQ(config.RenderSettings.maxShadowRays(), 4294967295u);
    EXPECT_EQ(ox::checkLoadedSettings(config), 0);

    // A clone is a deep, equal copy of every class of the tree.
    ox::OXConfig changed;
    load(
        "<OXConfig><TextureBakeSettings><targets><element><textureName>wall</textureName>"
        "<targetSurfaces><element><target>wallShape</target></element></targetSurfaces>"
        "</element></targets></TextureBakeSettings></OXConfig>",
        changed);
    const auto copy = changed.clone();
    EXPECT_EQ(written(*copy), written(changed));
    EXPECT_NE(written(*copy), text);
}

TEST_F(Catalog, OneKeyInEachObjectChangesExactlyThoseKeys) {
    const std::string defaults = written(ox::OXConfig());
    ox::OXConfig config;
    const std::string printed = load(R"(<?xml version="1.0"?>
<OXConfig>
  <FrameSettings><renderType> TextureBake
  </renderType></FrameSettings>
  <AASettings><filter>Mitchell</filter></AASettings>
  <ADSSettings><gridThreshold>12</gridThreshold></ADSSettings>
  <GISettings><ptDefaultColor><r>1</r><g>0.5</g><b>0.25</b></ptDefaultColor></GISettings>
  <RenderSettings><maxRayDepth>9</maxRayDepth></RenderSettings>
  <AOSettings><aoConeAngle>90</aoConeAngle></AOSettings>
  <TextureBakeSettings><Normalize><normalizeRange>MinMax</normalizeRange></Normalize>
  </TextureBakeSettings>
  <EnvironmentSettings><iblSwapYZ>1</iblSwapYZ></EnvironmentSettings>
  <SurfaceTransferSettings><envelopeMode>OutsideFirst</envelopeMode></SurfaceTransferSettings>
  <VertexBakeSettings><VertexBakeSamplingOptions><MaxSamples>16</MaxSamples>
  </VertexBakeSamplingOptions></VertexBakeSettings>
  <PointCloudBakeSettings><PointCloudBakeComponents><LUASettings><outputType>RGB</outputType>
  </LUASettings></PointCloudBakeComponents></PointCloudBakeSettings>
</OXConfig>)",
                                     config);
    EXPECT_EQ(printed, "");
    const auto before = lines(defaults);
    const auto after = lines(written(config));
    ASSERT_EQ(before.size(), after.size());
    std::vector<std::string> changed;
    for (size_t i = 0; i < before.size(); ++i)
        if (before[i] != after[i]) changed.push_back(after[i]);
    EXPECT_EQ(changed, (std::vector<std::string>{
                           "\t\t<filter>Mitchell</filter>",
                           "\t\t<gridThreshold>12</gridThreshold>",
                           "\t\t<aoConeAngle>90</aoConeAngle>",
                           "\t\t<iblSwapYZ>true</iblSwapYZ>",
                           "\t\t<renderType>TextureBake</renderType>",
                           "\t\t\t<r>1</r>",
                           "\t\t\t<g>0.5</g>",
                           "\t\t\t<b>0.25</b>",
                           "\t\t\t\t<outputType>RGB</outputType>",
                           "\t\t<maxRayDepth>9</maxRayDepth>",
                           "\t\t<envelopeMode>OutsideFirst</envelopeMode>",
                           "\t\t\t<normalizeRange>MinMax</normalizeRange>",
                           "\t\t\t<MaxSamples>16</MaxSamples>",
                       }));
    EXPECT_EQ(config.FrameSettings.renderType(), ox::RenderType::TextureBake);
    EXPECT_EQ(config.AASettings.filter(), ox::FilterType::Mitchell);
    EXPECT_EQ(config.PointCloudBakeSettings.PointCloudBakeComponents.LUASettings.outputType(),
              ox::PCOutputType::RGB);
}

TEST_F(Catalog, BadNamesAndNumbersWarnAndKeepTheDefaults) {
    ox::OXConfig config;
    const std::string printed = load(
        "<OXConfig><AASettings><samplingMode>Progressive</samplingMode>"
        "<minSampleRate>lots</minSampleRate></AASettings>"
        "<RenderSettings><motionBlur>2d</motionBlur></RenderSettings>"
        "<FrameSettngs/></OXConfig>",
        config);
    EXPECT_NE(printed.find("Warning, could not set value Progressive for enum samplingMode"),
              std::string::npos);
    EXPECT_NE(printed.find("Warning, could not set value 2d for enum motionBlur"),
              std::string::npos);  // names match exactly
    EXPECT_NE(printed.find("Warning, unknown node: FrameSettngs"), std::string::npos);
    EXPECT_EQ(config.AASettings.samplingMode(), ox::SamplingType::Adaptive);
    EXPECT_EQ(config.AASettings.samplingMode.value(), 1);
    EXPECT_EQ(config.AASettings.minSampleRate(), -2);
    EXPECT_EQ(config.RenderSettings.motionBlur(), ox::MotionBlurMode::Off);
    // "2D" and "3D" are names, not identifiers.
    EXPECT_TRUE(config.RenderSettings.motionBlur.setFromString("3D"));
    EXPECT_EQ(config.RenderSettings.motionBlur(), ox::MotionBlurMode::Blur3D);
    // SamplingType has no name for 0.
    config.AASettings.samplingMode.setValue(0);
    EXPECT_EQ(config.AASettings.samplingMode.toString(), "");
}

TEST_F(Catalog, BakeTargetsSurfacesAndLightPassesReadFromElementEntries) {
    ox::OXConfig config;
    EXPECT_EQ(load(R"(<OXConfig>
<TextureBakeSettings>
  <targets>
    <element><textureName>floor</textureName><hasResolutionOverride>true</hasResolutionOverride>
      <resolutionOverride><x>256</x><y>128</y></resolutionOverride>
      <targetSurfaces>
        <element><target>floorShape</target><name>a</name><UVScale><x>2</x><y>1</y></UVScale>
        </element>
        <BakeShape><target>rug</target></BakeShape>
      </targetSurfaces>
    </element>
  </targets>
  <RenderComponents><fullShading>true</fullShading>
    <lightPass><element><bakeType>LightMap</bakeType>
      <lights><element>sun</element><element>lamp</element></lights></element></lightPass>
    <customPasses><element>ambientOcclusion</element></customPasses>
  </RenderComponents>
</TextureBakeSettings>
<SurfaceTransferSettings><targets><element><textureName>hull</textureName>
  <UVPackSettings><enabled>true</enabled></UVPackSettings>
  <targetSurfaces><element><target>low</target>
    <sourceSurfaces><element>high</element></sourceSurfaces>
    <UVPackTargetSettings><ratioScale>2</ratioScale></UVPackTargetSettings>
  </element></targetSurfaces></element></targets></SurfaceTransferSettings>
<PointCloudBakeSettings><targets><element><input>points.pc</input>
  <sourceType>Shape</sourceType><LightLinks><enabled>true</enabled><mode>Excluding</mode>
  <lights><element>fill</element></lights></LightLinks></element></targets>
</PointCloudBakeSettings>
</OXConfig>)",
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

    const ox::SurfaceTransferSettingsBase &transfer = config.SurfaceTransferSettings;
    ASSERT_EQ(transfer.targets.size(), 1u);
    EXPECT_TRUE(transfer.targets[0].UVPackSettings.enabled());
    EXPECT_EQ(transfer.targets[0].UVPackSettings.type(), ox::UVPackAlgorithmType::Texel);
    ASSERT_EQ(transfer.targets[0].targetSurfaces.size(), 1u);
    EXPECT_EQ(transfer.targets[0].targetSurfaces[0].sourceSurfaces.values(),
              std::vector<std::string>{"high"});
    EXPECT_EQ(transfer.targets[0].targetSurfaces[0].UVPackTargetSettings.ratioScale(), 2.0f);

    const ox::PointCloudBakeSettingsBase &points = config.PointCloudBakeSettings;
    ASSERT_EQ(points.targets.size(), 1u);
    EXPECT_EQ(points.targets[0].sourceType(), ox::PCSource::Shape);
    EXPECT_EQ(points.targets[0].LightLinks.mode(), ox::LightLinkMode::Excluding);
    EXPECT_EQ(points.targets[0].LightLinks.lights.values(), std::vector<std::string>{"fill"});
}

TEST_F(Catalog, SchemaValidatesTheDefaultFileAndListsTheUndocumentedKeys) {
    const fs::path xml = dir_ / "config.xml", xsd = dir_ / "config.xsd";
    const ox::OXConfig config;
    ASSERT_TRUE(ox::writeSettings(xml.string(), config));
    CaptureStdout();
    ASSERT_TRUE(ox::writeSchema(xsd.string(), config));
    const std::string printed = GetCapturedStdout();

    std::multiset<std::string> undocumented;
    for (const std::string &l : lines(printed)) {
        const size_t a = l.find("Attribute ");
        if (a != std::string::npos) undocumented.insert(l.substr(a));
    }
    std::multiset<std::string> expected;
    auto add = [&](const char *type, std::vector<const char *> keys) {
        for (const char *k : keys)
            expected.insert(std::string("Attribute ") + k + " in type " + type +
                            " is undocumented");
    };
    add("ADSSettings", {"memLimit"});
    add("GISettings", {"frame",
                       "causticsPhotonMapAccuracy",
                       "causticsPhotonMapUseFile",
                       "causticsPhotonMapVisualize",
                       "globalPhotonMapVisualize",
                       "dynamicPhotonMapPreviewLightDirection",
                       "dynamicPhotonMapTotalPhotons",
                       "dynamicPhotonMapAccuracy",
                       "dynamicPhotonMapPhotons",
                       "dynamicPhotonMapRadius",
                       "dynamicPhotonMapUseFile",
                       "dynamicPhotonMapFile",
                       "dynamicPhotonMapMaxDepth",
                       "dynamicPhotonMapMinDepth",
                       "dynamicPhotonMapSHBands",
                       "dynamicPhotonMapSHGatherCells",
                       "dynamicPhotonMapGridCells",
                       "fgPreview",
                       "fgVisualize",
                       "fgMaxMovement",
                       "mcDepth"});
    add("RNMSettings", {"cosLobeExponent", "cosLobeExponent"});  // texture and vertex bakes
    add("RenderComponents", {"FullAndIndirectIlluminationSettings", "LightPassSettings"});
    add("UVPackSettings", {"maxTextures"});
    add("RangeRemapSettings", {"layer", "remapRGB", "remapAlpha"});
    add("SurfaceTransferTarget", {"target", "UVPackTargetSettings"});
    add("SurfaceTransferTexture", {"hasResolutionOverride"});
    add("VertexBakeComponents", {"fullAndIndirectIllumination", "customPasses", "lightPass"});
    EXPECT_EQ(undocumented, expected) << printed;

    const std::string schema = readFile(xsd);
    EXPECT_NE(schema.find("<xsd:documentation xml:lang=\"en\">Resolution for the rendering"),
              std::string::npos);
    EXPECT_NE(schema.find("<xsd:enumeration value=\"EXRMultiLayer\"/>"), std::string::npos);
    const std::string command = "xmllint --noout --schema '" + xsd.string() + "' '" + xml.string() +
                                "' > '" + (dir_ / "lint.txt").string() + "' 2>&1";
    EXPECT_EQ(std::system(command.c_str()), 0) << readFile(dir_ / "lint.txt");
}
