#include <gtest/gtest.h>

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
    std::string mesh = quad("s", "nope");
    std::string xml = file("s.xml",
                           "<OXScene><Instance><Name>i</Name><Shape>ghost</Shape>"
                           "</Instance></OXScene>");
    // A shape that no mesh file gives.
    RunResult r = runInspect(xml);
    EXPECT_EQ(r.status, 1);
    EXPECT_NE(r.output.find("Unable to load the scene: Missing shapes"), std::string::npos);
    EXPECT_EQ(r.output.find("Shapes:"), std::string::npos);
    // A material that the scene does not define.
    r = runInspect(mesh);
    EXPECT_EQ(r.status, 1);
    EXPECT_NE(r.output.find("Error creating temp shapes: Material nope not defined when loading "
                            "shape s"),
              std::string::npos)
        << r.output;
    // A damaged mesh file.
    std::string bad = file("bad.vtm", std::string("VTM\0\3\0\0\0", 8));
    r = runInspect(bad);
    EXPECT_EQ(r.status, 1);
    EXPECT_NE(r.output.find("[ERROR]    Failed to preopen file " + bad), std::string::npos);
    EXPECT_NE(r.output.find("unsupported temporary mesh version 3"), std::string::npos);
    // A scene document with another root.
    r = runInspect(file("x.xml", "<Scene/>"));
    EXPECT_EQ(r.status, 1);
    // A configuration that cannot be loaded.
    r = runInspect(xml + " -x " + (dir_ / "missing.xml").string());
    EXPECT_EQ(r.status, 3);
    EXPECT_NE(r.output.find("Unable to load settings from file"), std::string::npos);
    // Syntax errors.
    r = runInspect("");
    EXPECT_EQ(r.status, 2);
    EXPECT_NE(r.output.find("Usage: thevorn-inspect"), std::string::npos);
    EXPECT_EQ(runInspect(xml + " -q").status, 2);
    EXPECT_EQ(runInspect(xml + " -x").status, 2);
}

}  // namespace
