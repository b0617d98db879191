#include <gtest/gtest.h>
#include <sys/stat.h>

#include <fstream>
#include <string>

#include "scene/vtm.h"
#include "tests/support/test_support.h"

namespace {

const std::string kInspect = std::string(OX_BINARY_DIR) + "/tools/thevorn-inspect";

using oxtest::RunResult;

RunResult runInspect(const std::string &args) { return oxtest::runProgram(kInspect, args); }

class InspectTest : public oxtest::TempDirTest {
protected:
    InspectTest() : TempDirTest("oxinspect") {}

    // A quad from (-1, -1, z) to (1, 1, z) with one UV set and one material group.
    std::string quad(const std::string &shape, const std::string &material, float z = 0) {
        vtm::TempMesh m;
        m.name = shape;
        m.uvSetNames = {"map1"};
        const float corners[4][2] = {{-1, -1}, {1, -1}, {1, 1}, {-1, 1}};
        for (auto &c : corners) {
            m.vertices.insert(m.vertices.end(), {c[0], c[1], z, 0, 0, 1, 0, 0, 0, 0, 0, 0});
            m.uvs.insert(m.uvs.end(), {c[0], c[1]});
        }
        m.bounds = ox::BBox(ox::Vec3(-1, -1, z), ox::Vec3(1, 1, z));
        m.groups = {{material, 2}};
        m.indices = {0, 1, 2, 0, 2, 3};
        std::string path = (dir_ / (shape + ".vtm")).string();
        EXPECT_TRUE(vtm::writeTempMesh(path, m, 2));
        return path;
    }
    std::string file(const std::string &name, const std::string &text) {
        std::string path = (dir_ / name).string();
        std::ofstream(path) << text;
        return path;
    }
};

TEST_F(InspectTest, SummarisesALoadedScene) {
    std::string a = quad("low", "m", -1), b = quad("high", "m", 1);
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

}  // namespace
