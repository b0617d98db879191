// thevorn-inspect run as a user runs it: the summary of a scene, the checks of a configuration
// against it, and its failures.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <string>
#include <vector>

#include "scene/vtm.h"
#include "tests/support/test_support.h"

namespace {

const std::string kInspect = std::string(OX_BINARY_DIR) + "/tools/thevorn-inspect";

using oxtest::RunResult;

RunResult runInspect(const std::string &args) { return oxtest::runProgram(kInspect, args); }

class InspectTest : public oxtest::TempDirTest {
protected:
    InspectTest() : TempDirTest("oxinspect") {}

    /// A quad from (-1, -1, z) to (1, 1, z) of material "m" with the given UV sets (all the
    /// same layout).
    std::string quad(const std::string &shape, float z = 0,
                     const std::vector<std::string> &sets = {"map1"}) {
        vtm::TempMesh m;
        m.name = shape;
        m.uvSetNames = sets;
        const float corners[4][2] = {{-1, -1}, {1, -1}, {1, 1}, {-1, 1}};
        for (auto &c : corners) {
            m.vertices.insert(m.vertices.end(), {c[0], c[1], z, 0, 0, 1, 0, 0, 0, 0, 0, 0});
            for (size_t k = 0; k < sets.size(); ++k) m.uvs.insert(m.uvs.end(), {c[0], c[1]});
        }
        m.bounds = ox::BBox(ox::Vec3(-1, -1, z), ox::Vec3(1, 1, z));
        m.groups = {{"m", 2}};
        m.indices = {0, 1, 2, 0, 2, 3};
        const std::string path = (dir_ / (shape + ".vtm")).string();
        EXPECT_TRUE(vtm::writeTempMesh(path, m, 2));
        return path;
    }
    std::string file(const std::string &name, const std::string &text) {
        const std::string path = (dir_ / name).string();
        oxtest::writeFile(path, text);
        return path;
    }
};

TEST_F(InspectTest, SummarisesALoadedScene) {
    std::string a = quad("low", -1), b = quad("high", 1);
    std::string xml = file("s.xml",
                           "<OXScene><Material><Name>m</Name></Material>"
                           "<Instance><Name>i1</Name><Shape>low</Shape></Instance>"
                           "<Instance><Name>i2</Name><Shape>high</Shape>"
                           "<RenderStats><PrimaryVisibility>false</PrimaryVisibility></RenderStats>"
                           "</Instance>"
                           "<LightSource><Name>sun</Name><Type>DIRECTIONAL</Type></LightSource>"
                           "</OXScene>");
    std::string config =
        file("c.xml", "<OXConfig><RenderSettings><bias>0</bias></RenderSettings></OXConfig>");
    RunResult r = runInspect(xml + " " + a + " " + b + " -x " + config);
    EXPECT_EQ(r.status, 0) << r.output;
    for (const char *want : {"Shapes: 2\n  low: 2 triangles, 4 vertices, 1 UV sets (map1)\n",
                             "  i2: shape high, flags 0x4EDFE\n", "Materials: 1\n  m\n",
                             "Cameras: 1\n  camera1: perspective at (0, 2, 10)\n",
                             "Lights: 1\n  sun: SimpleDirectionalLight\n",
                             "Light links: 2 instances x 1 lights (16 bytes)",
                             "Scene box: (-1, -1, -1) - (1, 1, 1)", "Bias: 3.4641e-05"})
        EXPECT_NE(r.output.find(want), std::string::npos) << want << "\n" << r.output;
}

TEST_F(InspectTest, FailuresGiveTheRunsStatuses) {
    // A shape that no mesh file gives, a damaged mesh file, a configuration that cannot be
    // loaded, syntax errors: one message each, the run's status, and no summary.
    std::string xml = file("s.xml",
                           "<OXScene><Instance><Name>i</Name><Shape>ghost</Shape>"
                           "</Instance></OXScene>");
    std::string bad = file("bad.vtm", std::string("VTM\0\3\0\0\0", 8));
    // A named pipe given as a mesh file is refused at once; a device is no scene at all.
    const std::string pipe = (dir_ / "pipe.vtm").string();
    ASSERT_EQ(mkfifo(pipe.c_str(), 0600), 0);
    const struct {
        std::string args;
        int status;
        std::string text;
    } cases[] = {
        {xml, 1, "Unable to load the scene: Missing shapes"},
        {bad, 1, "[ERROR]    Failed to preopen file " + bad},
        {bad, 1, "unsupported temporary mesh version 3"},
        {pipe, 1, pipe + ": not a regular file"},
        {"/dev/zero", 1, "Unable to load the scene: No scene or mesh file among the inputs"},
        {xml + " -x " + (dir_ / "missing.xml").string(), 3, "Unable to load settings from file"},
        {"", 2, "Usage: thevorn-inspect"},
        {xml + " -q", 2, "Usage: thevorn-inspect"},
        {xml + " -x", 2, "Usage: thevorn-inspect"},
    };
    for (const auto &c : cases) {
        RunResult r = oxtest::runProgram("timeout 120 " + kInspect, c.args);
        EXPECT_EQ(r.status, c.status) << c.args;
        EXPECT_NE(r.output.find(c.text), std::string::npos) << c.text << "\n" << r.output;
        EXPECT_EQ(r.output.find("Shapes:"), std::string::npos);
    }
}

std::string target(const std::string &name, const std::string &shapes) {
    return "<BakeTextureTarget><hasResolutionOverride>true</hasResolutionOverride>"
           "<resolutionOverride><x>4</x><y>4</y></resolutionOverride><targetSurfaces>" +
           shapes + "</targetSurfaces><textureName>" + name + "</textureName></BakeTextureTarget>";
}

std::string shape(const std::string &instance, const std::string &uvSetOverride = "") {
    if (uvSetOverride.empty()) return "<BakeShape><target>" + instance + "</target></BakeShape>";
    return "<BakeShape><UVSetOverride>" + uvSetOverride +
           "</UVSetOverride><hasUVSetOverride>true</hasUVSetOverride><target>" + instance +
           "</target></BakeShape>";
}

std::string bake(const std::string &targets, const std::string &components,
                 const std::string &camera = "cam", const std::string &uvSet = "") {
    return "<OXConfig><FrameSettings><cameraName>" + camera +
           "</cameraName><renderType>TextureBake</renderType></FrameSettings>"
           "<TextureBakeSettings><RenderComponents>" +
           components + "</RenderComponents><targets>" + targets + "</targets><uvSet>" + uvSet +
           "</uvSet></TextureBakeSettings></OXConfig>";
}

const char *const kTwoPasses = "<albedo>true</albedo><illumination>true</illumination>";

}  // namespace

TEST_F(InspectTest, TheConfigurationIsCheckedAgainstTheScene) {
    const std::string ground = quad("ground", 0, {"map1", "LightMap"});
    const std::string roof = quad("roof", 2);
    const std::string lit = file("lit.xml",
                                 "<OXScene><Material><Name>m</Name></Material>"
                                 "<Camera><Name>cam</Name></Camera>"
                                 "<Instance><Name>ground</Name><Shape>ground</Shape></Instance>"
                                 "<Instance><Name>roof</Name><Shape>roof</Shape></Instance>"
                                 "<LightSource><Name>lamp</Name><Type>POINT</Type></LightSource>"
                                 "</OXScene>");
    const std::string dark = file("dark.xml",
                                  "<OXScene><Material><Name>m</Name></Material>"
                                  "<Instance><Name>ground</Name><Shape>ground</Shape></Instance>"
                                  "<Instance><Name>roof</Name><Shape>roof</Shape></Instance>"
                                  "</OXScene>");
    const std::string glowing =
        file("glow.xml",
             "<OXScene><Material><Name>m</Name><Emissive><Color><r>1</r><g>1</g><b>1</b><a>1</a>"
             "</Color><Scale>1</Scale></Emissive></Material>"
             "<Instance><Name>ground</Name><Shape>ground</Shape></Instance>"
             "<Instance><Name>roof</Name><Shape>roof</Shape></Instance></OXScene>");
    const std::string meshes = " " + ground + " " + roof;

    const struct {
        const char *what;
        std::string scene;
        std::string config;
        int status;
        std::vector<std::string> lines;
    } cases[] = {
        {"a bake that would run",
         lit,
         bake(target("ground", shape("ground")), kTwoPasses),
         0,
         {"  ok       renderType TextureBake: 1 target, 2 passes (tpIllumination, tpAlbedo)\n",
          "  ok       target ground: 4 x 4 texels; ground (UV set \"LightMap\")\n",
          "  ok       cameraName \"cam\" names a camera\n", "  ok       1 light (lamp)\n"}},
        {"a shape without the named set is skipped",
         lit,
         bake(target("both", shape("ground") + shape("roof")), kTwoPasses, "cam", "LightMap"),
         0,
         {"  warning  target both: instance roof has no UV set \"LightMap\" (it has map1); the "
          "run skips that shape\n",
          "  ok       target both: 4 x 4 texels; ground (UV set \"LightMap\")\n"}},
        {"one set on the shape and none named: the first",
         lit,
         bake(target("roof", shape("roof")), kTwoPasses),
         0,
         {"  ok       target roof: 4 x 4 texels; roof (UV set \"map1\")\n"}},
        {"a target whose only instance is missing",
         lit,
         bake(target("ground", shape("grund")), kTwoPasses),
         1,
         {"  error    target ground: nothing to bake: no instance is called \"grund\"\n",
          "Next: mend the configuration where the lines marked error say, then inspect again.\n"}},
        {"an override naming a set the shape lacks",
         lit,
         bake(target("ground", shape("ground", "uv7")), kTwoPasses),
         1,
         {"  error    target ground: nothing to bake: instance ground has no UV set \"uv7\" (it "
          "has map1, LightMap)\n"}},
        {"two targets with one name",
         lit,
         bake(target("t", shape("ground")) + target("t", shape("roof")), kTwoPasses),
         1,
         {"  error    target t: another target has this textureName"}},
        {"no pass",
         lit,
         bake(target("ground", shape("ground")), ""),
         1,
         {"  error    renderType TextureBake, but no pass is switched on"}},
        {"no targets",
         lit,
         bake("", kTwoPasses),
         1,
         {"  error    TextureBakeSettings/targets lists no BakeTextureTarget: nothing to bake\n"}},
        {"a camera name the scene lacks",
         lit,
         bake(target("ground", shape("ground")), kTwoPasses, "persp"),
         0,
         {"  note     cameraName \"persp\" names no camera; the run uses \"cam\", the scene's "
          "first\n"}},
        {"no light, no emissive material",
         dark,
         bake(target("ground", shape("ground")), kTwoPasses),
         0,
         {"  note     cameraName \"cam\" names no camera; the run uses \"camera1\"",
          "  warning  the scene has no light and no emissive material"}},
        {"an emissive material gives light",
         glowing,
         bake(target("ground", shape("ground")), kTwoPasses),
         0,
         {"  ok       1 emissive material (m)\n"}},
        {"a render names the camera it falls back to",
         lit,
         "<OXConfig><FrameSettings><cameraName>persp</cameraName></FrameSettings></OXConfig>",
         0,
         {"  note     renderType Render\n", "  warning  cameraName \"persp\" names no camera"}},
    };
    for (const auto &c : cases) {
        const std::string config = file("c.xml", c.config);
        const RunResult r = runInspect(c.scene + meshes + " -x " + config);
        EXPECT_EQ(r.status, c.status) << c.what << "\n" << r.output;
        for (const std::string &line : c.lines)
            EXPECT_NE(r.output.find(line), std::string::npos) << c.what << ": " << line << "\n"
                                                              << r.output;
        // The last line says what to do next.
        const size_t last = r.output.rfind('\n', r.output.size() - 2);
        EXPECT_EQ(r.output.compare(last + 1, 6, "Next: "), 0) << c.what << "\n" << r.output;
    }

    // Without a configuration the summary ends with the next step too; --help is no error.
    RunResult r = runInspect(dark + meshes);
    EXPECT_EQ(r.status, 0) << r.output;
    EXPECT_NE(r.output.find("\nNext: the scene has no lights; add one (README, \"Adding lights\")"),
              std::string::npos)
        << r.output;
    r = runInspect("--help");
    EXPECT_EQ(r.status, 0);
    EXPECT_EQ(r.output.rfind("Usage: thevorn-inspect", 0), 0u) << r.output;
}
