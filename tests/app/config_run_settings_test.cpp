// The run on the real configuration tree: what it reads, writes back and corrects.
#include "app/config_run_settings.h"

#include <gtest/gtest.h>

#include <fstream>

#include "app/command_line.h"
#include "app/run.h"
#include "app/settings_adapters.h"
#include "config/settings_checks.h"
#include "config/xml.h"
#include "core/message.h"
#include "tests/app/app_test_util.h"
#include "tests/support/test_support.h"

using apptest::readFile;
using testing::internal::CaptureStdout;
using testing::internal::GetCapturedStdout;

namespace {

class ConfigRun : public oxtest::TempDirTest {
protected:
    ConfigRun() : TempDirTest("ox_cfgrun_test_") {}
    static void write(const std::string &name, const std::string &text) {
        std::ofstream(name, std::ios::binary) << text;
    }
};

}  // namespace

TEST_F(ConfigRun, TheRunReadsWritesBackAndCorrectsTheLoadedFile) {
    write("cfg.xml", R"(<OXConfig><FrameSettings>
  <renderType>VertexBake</renderType><imageFormat>PPM</imageFormat>
  <autoThreads>false</autoThreads><renderThreads>3</renderThreads>
  <tileSize><x>0</x><y>32</y></tileSize>
  <outputVerbosity><debugFile>true</debugFile><verbosePrint>true</verbosePrint>
  </outputVerbosity></FrameSettings>
  <GISettings><fgFile>cache</fgFile><ptFile></ptFile></GISettings>
  <AOSettings><aoFile>occ</aoFile></AOSettings></OXConfig>)");
    auto driver = std::make_shared<apptest::RecordingDriver>();
    ox::RunEnvironment env = ox::defaultRunEnvironment();
    env.drivers.set(ox::kActionVertexBake, driver);
    CaptureStdout();
    const int32_t status = ox::runThevorn({"thevorn", "s.xml", "-x", "cfg.xml", "-od", "out"}, env);
    const std::string out = GetCapturedStdout();
    EXPECT_EQ(status, 0) << out;
    EXPECT_EQ(driver->actions.back(), ox::kActionVertexBake);  // from renderType
    EXPECT_EQ(driver->format, ox::kFormatExr);                 // PPM without a format option
    EXPECT_EQ(driver->threads, 3);                             // autoThreads off
    ASSERT_TRUE(driver->configured);
    EXPECT_EQ(driver->fgFile, "out/GI/fgMaps/cache");
    EXPECT_TRUE(driver->fgUseLegacy);
    EXPECT_EQ(driver->tileSize, ox::Vec2i(32, 32));
    EXPECT_NE(out.find("[WARNING]  FrameSettings tileSize is (0, 32), it must be positive; "
                       "using the default (32, 32)\n"),
              std::string::npos)
        << out;
    // The configuration's filters and debug file are in force from the output tree on.
    EXPECT_TRUE(ox::isTypeEnabled(ox::kMsgVerbose));
    const std::string debug = readFile("out/debug.out");
    EXPECT_NE(debug.find("KESTRIN RENDERER DEBUG MESSAGES"), std::string::npos);

    // An action option wins and is written back; -rt overrides the configured count.
    env.drivers.set(ox::kActionTextureBake, driver);
    CaptureStdout();
    EXPECT_EQ(ox::runThevorn({"thevorn", "s.xml", "-x", "cfg.xml", "-b", "-rt", "5", "-j"}, env),
              0);
    GetCapturedStdout();
    EXPECT_EQ(driver->actions.back(), ox::kActionTextureBake);
    EXPECT_EQ(driver->renderType, 1);  // written back
    EXPECT_EQ(driver->format, ox::kFormatJpeg);
    EXPECT_EQ(driver->renderThreads, 5);
}

TEST_F(ConfigRun, DefaultsReadBackUnchanged) {
    ox::ConfigRunSettings settings;
    ASSERT_TRUE(settings.writeDefault("config.xml"));
    CaptureStdout();
    ASSERT_TRUE(settings.load("config.xml"));
    EXPECT_EQ(GetCapturedStdout(), "");
    std::string again;
    ASSERT_TRUE(ox::writeSettingsToString(again, settings.config()));
    EXPECT_EQ(again, readFile("config.xml"));
}

TEST_F(ConfigRun, NumbersThatWouldBreakARunAreReset) {
    ox::ConfigRunSettings settings;
    write("bad.xml", R"(<OXConfig>
  <FrameSettings><resolution><x>-1</x><y>480</y></resolution>
    <outputCorrection><gamma>0</gamma></outputCorrection></FrameSettings>
  <AASettings><filterSize><x>1</x><y>0</y></filterSize></AASettings>
  <RenderSettings><bias>-0.5</bias><motionSteps>0</motionSteps></RenderSettings>
  <ADSSettings><gridDensity>0</gridDensity><gridMaxDepth>17</gridMaxDepth></ADSSettings>
</OXConfig>)");
    CaptureStdout();
    ASSERT_TRUE(settings.load("bad.xml"));
    const std::string out = GetCapturedStdout();
    const ox::OXConfig &c = settings.config();
    EXPECT_EQ(c.FrameSettings.resolution(), ox::Vec2i(640, 480));
    EXPECT_EQ(c.FrameSettings.outputCorrection.gamma(), 1.0f);
    EXPECT_EQ(c.AASettings.filterSize(), ox::Vec2(1, 1));
    EXPECT_EQ(c.RenderSettings.bias(), 0.005f);
    EXPECT_EQ(c.RenderSettings.motionSteps(), 1u);
    EXPECT_EQ(c.ADSSettings.gridDensity(), 1.0f);
    EXPECT_EQ(c.ADSSettings.gridMaxDepth(), 4u);
    for (const char *line :
         {"[WARNING]  FrameSettings resolution is (-1, 480), it must be positive; using the "
          "default (640, 480)\n",
          "[WARNING]  RenderSettings bias is -0.5, it must be zero or positive; using the "
          "default 0.005\n",
          "[WARNING]  RenderSettings motionSteps is 0, it must be at least 1; using the "
          "default 1\n",
          "[WARNING]  ADSSettings gridMaxDepth is 17, it must be at most 16; using the "
          "default 4\n",
          "[WARNING]  ADSSettings gridDensity is 0, it must be positive; using the default 1\n"})
        EXPECT_NE(out.find(line), std::string::npos) << line << out;

    // Values at the edge of the rules stay.
    ox::OXConfig edge;
    edge.RenderSettings.bias = 0.0f;
    edge.ADSSettings.gridMaxDepth = 16u;
    edge.FrameSettings.tileSize = ox::Vec2i(1, 1);
    EXPECT_EQ(ox::checkLoadedSettings(edge), 0);
}

TEST_F(ConfigRun, RenderRegionIsClippedToTheResolution) {
    ox::OXConfig c;
    ox::FrameSettingsBase &f = c.FrameSettings;
    f.regionRender = true;  // the default region is the whole default frame
    EXPECT_EQ(ox::renderRegion(f), ox::Region(0, 0, 640, 480));
    f.regionLowerLeft = ox::Vec2i(-20, 100);
    f.regionTopRight = ox::Vec2i(300, 900);
    EXPECT_EQ(ox::renderRegion(f), ox::Region(0, 100, 300, 480));
    f.regionLowerLeft = ox::Vec2i(700, 0);  // right of the frame
    EXPECT_TRUE(ox::renderRegion(f).isEmpty());
    f.regionLowerLeft = ox::Vec2i(10, 10);
    f.regionTopRight = ox::Vec2i(10, 400);  // no width
    EXPECT_TRUE(ox::renderRegion(f).isEmpty());
    f.regionRender = false;
    EXPECT_EQ(ox::renderRegion(f), ox::Region(0, 0, 640, 480));
}

TEST_F(ConfigRun, InputCheckValuesAndCacheFiles) {
    ox::ConfigRunSettings settings;
    write("in.xml", R"(<OXConfig>
  <TextureBakeSettings><resolutionScale>0.5</resolutionScale>
    <targets><element><textureName>wall</textureName>
      <hasResolutionOverride>true</hasResolutionOverride>
      <resolutionOverride><x>512</x><y>1</y></resolutionOverride></element></targets>
    <RenderComponents><lua>true</lua><LUASettings><scriptFile>bake.lua</scriptFile>
    </LUASettings></RenderComponents></TextureBakeSettings>
  <SurfaceTransferSettings><targets><element><textureName>hull</textureName></element>
  </targets></SurfaceTransferSettings>
  <VertexBakeSettings><VertexBakeComponents><lightPass><element/><element/></lightPass>
  </VertexBakeComponents></VertexBakeSettings>
  <EnvironmentSettings><giEnvironment>IBL</giEnvironment><iblImageFile>sky.hdr</iblImageFile>
  </EnvironmentSettings>
  <GISettings><enableGI>true</enableGI><secondaryIntegrator>GlobalPhotonMap</secondaryIntegrator>
    <fgUseCache>RadianceSH</fgUseCache><fgUseFile>Reuse</fgUseFile>
    <globalPhotonMapUseFile>ReuseAndAppend</globalPhotonMapUseFile></GISettings>
</OXConfig>)");
    CaptureStdout();
    ASSERT_TRUE(settings.load("in.xml"));
    EXPECT_EQ(GetCapturedStdout(), "");
    const ox::InputCheckSettings s = settings.inputCheckSettings();
    EXPECT_EQ(s.vertexBakeLightPasses, 2);
    ASSERT_TRUE(s.firstTextureBakeTarget.has_value());
    EXPECT_EQ(s.firstTextureBakeTarget->name, "wall");
    EXPECT_EQ(s.firstTextureBakeTarget->width, 256);
    EXPECT_EQ(s.firstTextureBakeTarget->height, 0);  // 1 x 0.5 truncates to nothing
    ASSERT_TRUE(s.firstSurfaceTransferTarget.has_value());
    EXPECT_EQ(s.firstSurfaceTransferTarget->name, "hull");
    EXPECT_EQ(s.firstSurfaceTransferTarget->width, 640);  // the frame resolution
    EXPECT_TRUE(s.imageBasedEnvironment);
    EXPECT_EQ(s.environmentImageFile, "sky.hdr");
    EXPECT_TRUE(s.enableGI);
    EXPECT_EQ(s.primaryIntegrator, ox::kIntegratorFinalGather);
    EXPECT_EQ(s.secondaryIntegrator, ox::kIntegratorGlobalPhotonMap);
    EXPECT_EQ(s.finalGatherCacheKind, 2);
    EXPECT_EQ(s.finalGatherCacheMode, 2);
    EXPECT_EQ(s.globalPhotonMapMode, 3);
    EXPECT_TRUE(s.textureBakeUsesLua);
    EXPECT_EQ(s.textureBakeLuaFile, "bake.lua");
    EXPECT_FALSE(s.vertexBakeUsesLua || s.pointCloudBakeUsesLua);

    const std::pair<ox::CacheFile, std::string> keys[] = {
        {ox::CacheFile::kFinalGather, "fgFile"},
        {ox::CacheFile::kPathTracer, "ptFile"},
        {ox::CacheFile::kGlobalPhotonMap, "globalPhotonMapFile"},
        {ox::CacheFile::kCausticsPhotonMap, "causticsPhotonMapFile"},
        {ox::CacheFile::kDynamicPhotonMap, "dynamicPhotonMapFile"},
        {ox::CacheFile::kOcclusionMap, "aoFile"}};
    for (const auto &[which, key] : keys) settings.setCacheFile(which, key + ".bin");
    std::string xml;
    ASSERT_TRUE(ox::writeSettingsToString(xml, settings.config()));
    for (const auto &[which, key] : keys)
        EXPECT_NE(xml.find("<" + key + ">" + key + ".bin</" + key + ">"), std::string::npos) << key;
}

TEST_F(ConfigRun, SceneAndTracerRecordsFollowTheSettings) {
    ox::OXConfig config;
    // The defaults of the records and of the settings agree.
    const ox::SceneLoadSettings d = ox::sceneLoadSettings(config, 4);
    const ox::SceneLoadSettings plain;
    EXPECT_EQ(d.threadCount, 4);
    EXPECT_EQ(d.mesh.mergeThreshold, plain.mesh.mergeThreshold);
    EXPECT_EQ(d.bias, plain.bias);
    EXPECT_EQ(d.environment.iblImageFile, plain.environment.iblImageFile);
    const ox::ADSParameters a = ox::adsParameters(config.ADSSettings), plainAds;
    EXPECT_EQ(a.gridMaxDepth, plainAds.gridMaxDepth);
    EXPECT_EQ(a.gridDensity, plainAds.gridDensity);
    EXPECT_EQ(a.instancingThreshold, plainAds.instancingThreshold);

    write("s.xml", R"(<OXConfig><FrameSettings><renderType>PointCloudBake</renderType>
  </FrameSettings><RenderSettings><vertexMergeThreshold>0.25</vertexMergeThreshold>
  <tsOddUVFlipping>false</tsOddUVFlipping><tsVertexNormalization>false</tsVertexNormalization>
  <bias>0</bias><motionBlur>3D</motionBlur><motionSteps>4</motionSteps>
  <shutterOpen>0.25</shutterOpen></RenderSettings>
  <ADSSettings><gridThreshold>7</gridThreshold><useSSE>false</useSSE>
  <useInstancing>Always</useInstancing></ADSSettings>
  <EnvironmentSettings><rtEnvironment>SkyLight</rtEnvironment>
  <skyLightColor><r>0.5</r><g>0.25</g><b>1</b><a>1</a></skyLightColor>
  <iblTurnDome>90</iblTurnDome><iblEmitPhotons>true</iblEmitPhotons></EnvironmentSettings>
</OXConfig>)");
    CaptureStdout();
    ASSERT_TRUE(ox::loadSettings("s.xml", config));
    EXPECT_EQ(GetCapturedStdout(), "");
    const ox::SceneLoadSettings s = ox::sceneLoadSettings(config, 0);
    EXPECT_EQ(s.threadCount, 1);
    EXPECT_EQ(s.jobKind, 5);
    EXPECT_EQ(s.mesh.mergeThreshold, 0.25f);
    EXPECT_FALSE(s.mesh.tangentSpace.oddUVFlipping);
    EXPECT_FALSE(s.mesh.tangentSpace.normalize);
    EXPECT_EQ(s.bias, 0.0f);  // the loader picks a bias from the scene
    EXPECT_EQ(s.environment.rtEnvironment, 2);
    EXPECT_EQ(s.environment.skyLightColor, ox::Color(0.5f, 0.25f, 1.0f, 1.0f));
    EXPECT_EQ(s.environment.iblTurnDome, 90.0f);
    EXPECT_TRUE(s.environment.iblEmitPhotons);
    const ox::ADSParameters ads = ox::adsParameters(config.ADSSettings);
    EXPECT_EQ(ads.gridThreshold, 7u);
    EXPECT_FALSE(ads.useSSE);
    EXPECT_EQ(ads.useInstancing, ox::kInstancingAlways);
    const ox::MotionBlurHandler motion = ox::motionBlurHandler(config.RenderSettings);
    EXPECT_TRUE(motion.threeD());
    EXPECT_EQ(motion.steps(), 4u);
    EXPECT_EQ(motion.shutterOpen(), 0.25f);
}
