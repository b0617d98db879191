#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>

#include "pointcloud/point_cloud_io.h"
#include "tests/support/point_cloud_samples.h"
#include "tests/support/test_support.h"

namespace {

const std::string kPtc = std::string(OX_BINARY_DIR) + "/tools/thevorn-ptc";

using oxtest::RunResult;

RunResult runPtc(const std::string &args) { return oxtest::runProgram(kPtc, args); }

using oxtest::readFile;

class PtcTest : public oxtest::TempDirTest {
protected:
    PtcTest() : TempDirTest("oxptc") {}
};

TEST_F(PtcTest, ConvertingToXmlAndBackGivesTheSameBytesForEveryKind) {
    for (const ox::PointSampleFactory &kind : oxtest::everyKind()) {
        const std::string name = kind.typeName();
        ASSERT_TRUE(ox::writePointCloud(name + ".ptc", oxtest::sampleCloud(kind, 7)));
        RunResult r = runPtc("convert " + name + ".ptc " + name + ".xml");
        ASSERT_EQ(r.status, 0) << r.output;
        EXPECT_NE(r.output.find("Writing file " + name + ".xml to disk..."), std::string::npos);
        r = runPtc("convert " + name + ".xml " + name + "2.ptc");
        ASSERT_EQ(r.status, 0) << r.output;
        EXPECT_EQ(readFile(name + "2.ptc"), readFile(name + ".ptc")) << name;
        EXPECT_NE(readFile(name + ".xml").find("<" + name + ">"), std::string::npos) << name;
    }
}

TEST_F(PtcTest, InfoPrintsTheHeaderVariablesAndFirstSamples) {
    ox::PointCloud cloud = ox::PhotonPointSampleFactory().create();
    cloud.header().description = "photons of the hall";
    ASSERT_TRUE(cloud.resize(3));
    for (uint64_t i = 0; i < 3; ++i) {
        cloud.setVec3(i, cloud.variables()[0], ox::Vec3(float(i), 2, -3));
        cloud.setVec3(i, cloud.variables()[3], ox::Vec3(0.1f, 0.5f, 1));
    }
    cloud.updateBounds();
    cloud.header().objectToWorld.m[3][0] = 2.5f;
    ASSERT_TRUE(ox::writePointCloud("p.xml", cloud));
    RunResult r = runPtc("info p.xml --points 2");
    ASSERT_EQ(r.status, 0) << r.output;
    for (const char *want :
         {"File: p.xml (XML)\n", "Kind: photonPoint (type id 4)\n",
          "Description: photons of the hall\n", "Points: 3\nPoint size: 48 bytes\n",
          "Bounding box: (0, 2, -3) - (2, 2, -3)\n", "  2.5 0 0 1\n", "Variables: 4\n",
          "  position: float x 3 (offset 0)\n", "  flux: float x 3 (offset 36)\n",
          "Samples (first 2 of 3):\n",
          "  1: position (1, 2, -3) normal (0, 0, 0) incident (0, 0, 0) flux (0.100000001, 0.5, "
          "1)\n"})
        EXPECT_NE(r.output.find(want), std::string::npos) << want << "\n" << r.output;
    EXPECT_EQ(r.output.find("  2: "), std::string::npos) << r.output;
    EXPECT_EQ(r.output.find("Reading file"), std::string::npos) << r.output;
}

TEST_F(PtcTest, FailuresGiveStatusOneAndSyntaxErrorsTwo) {
    ASSERT_TRUE(ox::writePointCloud("good.ptc", oxtest::sampleCloud(ox::PointSampleFactory(), 2)));
    std::string damaged = readFile("good.ptc");
    damaged.resize(damaged.size() - 1);
    std::ofstream("bad.ptc", std::ios::binary) << damaged;
    std::ofstream("keep.xml") << "existing";
    const struct {
        std::string args;
        int status;
        std::string text;
    } cases[] = {
        {"info missing.ptc", 1, "Could not open file missing.ptc for reading!"},
        {"info bad.ptc", 1, "Unexpected end of file in bad.ptc!"},
        {"convert bad.ptc keep.xml", 1, "Unexpected end of file in bad.ptc!"},
        {"convert good.ptc no/such/dir/out.xml", 1, "Could not open file no/such/dir/out.xml"},
        {"", 2, "Usage: thevorn-ptc"},
        {"info", 2, "info needs exactly one file"},
        {"info good.ptc --points", 2, "--points needs a number"},
        {"info good.ptc --points -1", 2, "--points needs a number"},
        {"info good.ptc --points 1x", 2, "--points needs a number"},
        {"convert good.ptc", 2, "convert needs an input and an output file"},
        {"convert good.ptc a.xml --points 3", 2, "Unknown option --points"},
        {"inspect good.ptc", 2, "Unknown command inspect"},
    };
    for (const auto &c : cases) {
        RunResult r = runPtc(c.args);
        EXPECT_EQ(r.status, c.status) << c.args << "\n" << r.output;
        EXPECT_NE(r.output.find(c.text), std::string::npos) << c.args << "\n" << r.output;
    }
    EXPECT_EQ(readFile("keep.xml"), "existing");
    EXPECT_EQ(runPtc("--help").status, 0);
}

}  // namespace
