#include "pointcloud/point_cloud.h"

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>

#include <filesystem>
#include <fstream>
#include <sstream>

#include "pointcloud/point_cloud_io.h"
#include "tests/support/point_cloud_samples.h"
#include "tests/support/test_support.h"

namespace {

using ox::PointCloud;
using ox::PointCloudEncoding;
namespace fs = std::filesystem;

using oxtest::countOf;
using oxtest::readFile;

std::string toBytes(const PointCloud &cloud, PointCloudEncoding e = PointCloudEncoding::Binary) {
    std::string out;
    EXPECT_TRUE(ox::writePointCloudToMemory(out, e, cloud));
    return out;
}

PointCloud fromBytes(const std::string &bytes, PointCloudEncoding e = PointCloudEncoding::Binary,
                     const ox::PointSampleFactory *expected = nullptr) {
    PointCloud cloud;
    EXPECT_TRUE(ox::readPointCloudFromMemory(bytes, e, cloud, expected));
    return cloud;
}

class PointCloudFiles : public oxtest::TempDirTest {
protected:
    PointCloudFiles() : TempDirTest("oxpc_") {}
};

TEST(PointCloud, EveryKindRoundTripsThroughBothEncodingsBitForBit) {
    for (const ox::PointSampleFactory &kind : oxtest::everyKind()) {
        for (uint64_t points : {0, 1, 37}) {
            SCOPED_TRACE(std::string(kind.typeName()) + " x " + std::to_string(points));
            const PointCloud cloud = oxtest::sampleCloud(kind, points, uint32_t(points) + 3);
            ASSERT_EQ(cloud.pointSize(), kind.pointSize());
            const std::string binary = toBytes(cloud);
            ASSERT_EQ(binary.size(),
                      176 + 40 * kind.variables().size() + points * kind.pointSize());

            const PointCloud fromBinary = fromBytes(binary, PointCloudEncoding::Binary, &kind);
            EXPECT_TRUE(fromBinary == cloud);
            EXPECT_EQ(toBytes(fromBinary), binary);

            const std::string xml = toBytes(cloud, PointCloudEncoding::Xml);
            const PointCloud fromXml = fromBytes(xml, PointCloudEncoding::Xml, &kind);
            EXPECT_TRUE(fromXml == cloud);
            EXPECT_EQ(toBytes(fromXml), binary);
        }
    }
}

TEST(PointCloud, BinaryLayoutIsPackedLittleEndian) {
    // A radiance sample is 248 bytes; the header is 176 bytes plus 40 per variable.
    EXPECT_EQ(ox::RadianceSampleFactory().pointSize(), 248u);
    PointCloud cloud = ox::PointSampleFactory().create();
    cloud.header().description = "d";
    cloud.header().compression = 7;
    ASSERT_TRUE(cloud.resize(2));
    const ox::PointVariable &pos = cloud.variables()[0];
    cloud.setVec3(0, pos, ox::Vec3(1, 2, 3));
    cloud.setVec3(1, pos, ox::Vec3(-1, 0.5f, 8));
    cloud.updateBounds();
    const std::string b = toBytes(cloud);
    ASSERT_EQ(b.size(), 176u + 40 + 24);
    auto u32 = [&](size_t at) {
        uint32_t v;
        std::memcpy(&v, b.data() + at, 4);
        return v;
    };
    auto f32 = [&](size_t at) {
        float v;
        std::memcpy(&v, b.data() + at, 4);
        return v;
    };
    EXPECT_EQ(u32(0), 1u);  // version
    EXPECT_EQ(std::string(b.data() + 4, 32), std::string("d") + std::string(31, '\0'));
    EXPECT_EQ(std::string(b.data() + 36), "point");  // type name
    EXPECT_EQ(u32(68), 0u);                          // typeId
    EXPECT_EQ(u32(72), 7u);                          // compression
    EXPECT_EQ(f32(76), -1.0f);                       // minimum x
    EXPECT_EQ(f32(96), 8.0f);                        // maximum z
    EXPECT_EQ(f32(100), 1.0f);                       // matrix [0][0]
    EXPECT_EQ(f32(100 + 4 * 15), 1.0f);              // matrix [3][3]
    EXPECT_EQ(u32(164), 2u);                         // numPoints
    EXPECT_EQ(u32(168), 12u);                        // pointSize
    EXPECT_EQ(u32(172), 1u);                         // numVariables
    EXPECT_EQ(std::string(b.data() + 176), "position");
    EXPECT_EQ(u32(208), 4u);             // element size
    EXPECT_EQ(u32(212), 3u);             // element count
    EXPECT_EQ(f32(216 + 12 + 4), 0.5f);  // second sample's y
}

TEST(PointCloud, ExtensionChoosesTheEncoding) {
    const struct {
        const char *path;
        PointCloudEncoding encoding;
    } cases[] = {
        {"a.xml", PointCloudEncoding::Xml},          {"dir/b.ptc.xml", PointCloudEncoding::Xml},
        {"a.XML", PointCloudEncoding::Binary},       {"a.xml.ptc", PointCloudEncoding::Binary},
        {"noextension", PointCloudEncoding::Binary}, {"dir.xml/cloud", PointCloudEncoding::Binary},
        {"a.xmlx", PointCloudEncoding::Binary},
    };
    for (const auto &c : cases) EXPECT_EQ(ox::pointCloudEncodingOf(c.path), c.encoding) << c.path;
}

TEST(PointCloud, VariablesAreFoundByNameNotByPlace) {
    // A photon cloud whose variables come in another order and carry an extra one still reads
    // as photons, and each value lands where its name says.
    PointCloud odd;
    odd.header().type = "photonPoint";
    odd.header().typeId = 4;
    odd.addVariable("flux", ox::PointDataType::Float, 3);
    odd.addVariable("extra", ox::PointDataType::Int16, 2);
    odd.addVariable("incident", ox::PointDataType::Float, 3);
    odd.addVariable("normal", ox::PointDataType::Float, 3);
    odd.addVariable("position", ox::PointDataType::Float, 3);
    ASSERT_TRUE(odd.resize(1));
    odd.setVec3(0, *odd.findVariable("position"), ox::Vec3(4, 5, 6));
    odd.setVec3(0, *odd.findVariable("flux"), ox::Vec3(0.25f, 0.5f, 1));
    odd.setInt(0, *odd.findVariable("extra"), 1, -300);
    const ox::PhotonPointSampleFactory photons;
    for (PointCloudEncoding e : {PointCloudEncoding::Binary, PointCloudEncoding::Xml}) {
        PointCloud back = fromBytes(toBytes(odd, e), e, &photons);
        EXPECT_TRUE(back == odd);
        EXPECT_EQ(back.getVec3(0, *back.findVariable("position")), ox::Vec3(4, 5, 6));
        EXPECT_EQ(back.getInt(0, *back.findVariable("extra"), 1), -300);
    }

    // The same cloud expected as irradiance samples: a warning for the type, then a refusal,
    // because irradiance variables are missing.
    const ox::IrradianceSampleFactory irradiance;
    const std::string bytes = toBytes(odd);
    PointCloud target = oxtest::sampleCloud(ox::PointSampleFactory(), 2);
    const PointCloud before = target;
    std::string out = oxtest::captureOutput([&] {
        EXPECT_FALSE(
            ox::readPointCloudFromMemory(bytes, PointCloudEncoding::Binary, target, &irradiance));
    });
    EXPECT_NE(out.find("is of a different type, sample data will not be read correctly"),
              std::string::npos)
        << out;
    EXPECT_NE(out.find("lack the variable value of irradiancePoint samples"), std::string::npos)
        << out;
    EXPECT_TRUE(target == before);  // a failed read leaves the cloud alone

    // A variable of the right name but another size is not taken for the expected one.
    PointCloud wide;
    wide.addVariable("position", ox::PointDataType::Double, 3);
    out = oxtest::captureOutput([&] {
        PointCloud c;
        EXPECT_FALSE(
            ox::readPointCloudFromMemory(toBytes(wide), PointCloudEncoding::Binary, c, &photons));
    });
    EXPECT_NE(out.find("lack the variable position"), std::string::npos) << out;
}

TEST(PointCloud, VersionsOtherThanOneWarnOrFail) {
    const std::string good = toBytes(oxtest::sampleCloud(ox::PointSampleFactory(), 2));
    auto withVersion = [&](uint32_t v) {
        std::string b = good;
        std::memcpy(b.data(), &v, 4);
        return b;
    };
    PointCloud c;
    std::string out = oxtest::captureOutput([&] {
        EXPECT_FALSE(ox::readPointCloudFromMemory(withVersion(2), PointCloudEncoding::Binary, c));
    });
    EXPECT_NE(out.find("is not a valid binary point cloud file!"), std::string::npos) << out;
    EXPECT_NE(out.find("is not a valid binary point could file!"), std::string::npos) << out;
    out = oxtest::captureOutput([&] {
        EXPECT_TRUE(ox::readPointCloudFromMemory(withVersion(0), PointCloudEncoding::Binary, c));
    });
    EXPECT_NE(out.find("is from another version (version = 0 | current version = 1)"),
              std::string::npos)
        << out;
    EXPECT_NE(out.find("File might not be read correctly"), std::string::npos) << out;
    EXPECT_EQ(c.size(), 2u);
    EXPECT_EQ(toBytes(c), good);  // rewritten in the current version
}

TEST(PointCloud, LongNamesAreCutWithAWarning) {
    PointCloud cloud;
    cloud.header().description = std::string(40, 'd');
    // 30 ASCII bytes and a two-byte letter: the cut must not split the letter.
    cloud.header().type = std::string(30, 't') + "\xc3\xa9" + "more";
    cloud.addVariable(std::string(31, 'v'), ox::PointDataType::Float, 1);
    cloud.addVariable(std::string(33, 'w'), ox::PointDataType::Float, 1);
    ASSERT_TRUE(cloud.resize(1));
    std::string bytes;
    std::string out = oxtest::captureOutput([&] { bytes = toBytes(cloud); });
    EXPECT_EQ(countOf(out, "is longer than 31 bytes"), 3) << out;
    PointCloud back = fromBytes(bytes);
    EXPECT_EQ(back.header().description, std::string(31, 'd'));
    EXPECT_EQ(back.header().type, std::string(30, 't'));
    EXPECT_EQ(back.variables()[0].name, std::string(31, 'v'));
    EXPECT_EQ(back.variables()[1].name, std::string(31, 'w'));

    // Two names that are the same once cut cannot both be written.
    PointCloud twins;
    twins.addVariable(std::string(31, 'v') + "1", ox::PointDataType::Float, 1);
    twins.addVariable(std::string(31, 'v') + "2", ox::PointDataType::Float, 1);
    out = oxtest::captureOutput([&] {
        std::string b;
        EXPECT_FALSE(ox::writePointCloudToMemory(b, PointCloudEncoding::Binary, twins));
    });
    EXPECT_NE(out.find("two variables are both named"), std::string::npos) << out;
}

TEST(PointCloud, XmlCarriesEveryFieldInItsElements) {
    PointCloud cloud = oxtest::sampleCloud(ox::RadianceSampleFactory(), 1);
    const std::string xml = toBytes(cloud, PointCloudEncoding::Xml);
    EXPECT_EQ(xml.rfind("<?xml version=\"1.0\" encoding=\"ISO-8859-1\"?>", 0), 0u) << xml;
    // Header children in order, then the sample with every variable, normals included.
    std::istringstream order(
        "<header> <version>1</version> <description> <type>radiancePoint</type> "
        "<typeId>10</typeId> <compression> <boundingBoxMinCorner> <boundingBoxMaxCorner> "
        "<objectToWorldMatrix> <r> <c> <numPoints>1</numPoints> <pointSize>248</pointSize> "
        "<numVariables>12</numVariables> <variableDefinition> "
        "<variableName>position</variableName> <dataTypeSize>4</dataTypeSize> "
        "<dataTypeCount>3</dataTypeCount> <body> <radiancePoint> <position> <x> <normal> "
        "<faceNormal> <radius> <uGrad> <vGrad> <redValues> <element> <greenValues> <blueValues> "
        "<uGradValues> <vGradValues> <occlusion> </radiancePoint>");
    size_t at = 0;
    for (std::string want; order >> want;) {
        const size_t found = xml.find(want, at);
        ASSERT_NE(found, std::string::npos) << want << "\n" << xml;
        at = found;
    }
    // Nine significant digits: 0.1f is not written as "0.1".
    PointCloud tenth;
    tenth.addVariable("radius", ox::PointDataType::Float, 1);
    ASSERT_TRUE(tenth.resize(1));
    tenth.setFloat(0, tenth.variables()[0], 0, 0.1f);
    EXPECT_NE(toBytes(tenth, PointCloudEncoding::Xml).find("<radius>0.100000001</radius>"),
              std::string::npos);
}

TEST(PointCloud, AMillionPointsRoundTrip) {
    const ox::PointSampleFactory kind;
    PointCloud cloud = kind.create();
    ASSERT_TRUE(cloud.resize(1000000));
    const ox::PointVariable &pos = cloud.variables()[0];
    for (uint64_t i = 0; i < cloud.size(); ++i)
        cloud.setVec3(i, pos, ox::Vec3(float(i) * 0.001f, 1.0f / float(i + 1), -float(i % 977)));
    cloud.updateBounds();
    const std::string binary = toBytes(cloud);
    const PointCloud fromBinary = fromBytes(binary);
    EXPECT_TRUE(fromBinary == cloud);
    const PointCloud fromXml =
        fromBytes(toBytes(cloud, PointCloudEncoding::Xml), PointCloudEncoding::Xml);
    EXPECT_TRUE(fromXml == cloud);
    EXPECT_EQ(toBytes(fromXml), binary);
}

TEST_F(PointCloudFiles, FilesAreWrittenAndReadByTheirNames) {
    const PointCloud cloud = oxtest::sampleCloud(ox::PhotonPointSampleFactory(), 5);
    for (const char *name : {"c.ptc", "c.xml", "c.XML", "c"}) {
        std::string out =
            oxtest::captureOutput([&] { EXPECT_TRUE(ox::writePointCloud(name, cloud)); });
        EXPECT_NE(out.find(std::string("Writing file ") + name + " to disk..."), std::string::npos);
        const bool xml = std::string(name) == "c.xml";
        EXPECT_EQ(readFile(name).rfind("<?xml", 0) == 0, xml) << name;
        PointCloud back;
        out = oxtest::captureOutput([&] { EXPECT_TRUE(ox::readPointCloud(name, back)); });
        EXPECT_NE(out.find(std::string("Reading file ") + name + " from disk..."),
                  std::string::npos);
        EXPECT_TRUE(back == cloud) << name;
    }
    // Nothing but the four files: no temporary names left behind.
    EXPECT_EQ(std::distance(fs::directory_iterator(dir_), fs::directory_iterator()), 4);

    PointCloud c;
    std::string out =
        oxtest::captureOutput([&] { EXPECT_FALSE(ox::readPointCloud("missing.ptc", c)); });
    EXPECT_NE(out.find("Could not open file missing.ptc for reading!"), std::string::npos) << out;
    out = oxtest::captureOutput([&] { EXPECT_FALSE(ox::readPointCloud(dir_.string(), c)); });
    EXPECT_NE(out.find("for reading!"), std::string::npos) << out;
    out = oxtest::captureOutput(
        [&] { EXPECT_FALSE(ox::writePointCloud("no/such/dir/c.ptc", cloud)); });
    EXPECT_NE(out.find("Could not open file no/such/dir/c.ptc for writing!"), std::string::npos)
        << out;
}

TEST_F(PointCloudFiles, FailedWritesLeaveTheOldFileAndNoTrace) {
    const PointCloud small = oxtest::sampleCloud(ox::PointSampleFactory(), 2);
    const PointCloud big = oxtest::sampleCloud(ox::RadianceSampleFactory(), 2000);
    // A file-size limit makes the writes fail part way, as a full disk would.
    signal(SIGXFSZ, SIG_IGN);
    struct rlimit old;
    ASSERT_EQ(getrlimit(RLIMIT_FSIZE, &old), 0);
    for (const char *name : {"old.ptc", "old.xml"}) {
        ASSERT_TRUE(ox::writePointCloud(name, small));
        const std::string before = readFile(name);
        struct rlimit low = old;
        low.rlim_cur = 64 * 1024;
        ASSERT_EQ(setrlimit(RLIMIT_FSIZE, &low), 0);
        std::string out =
            oxtest::captureOutput([&] { EXPECT_FALSE(ox::writePointCloud(name, big)); });
        ASSERT_EQ(setrlimit(RLIMIT_FSIZE, &old), 0);
        EXPECT_NE(out.find(std::string("Could not write file ") + name), std::string::npos) << out;
        EXPECT_EQ(readFile(name), before) << name;
    }
    signal(SIGXFSZ, SIG_DFL);
    EXPECT_EQ(std::distance(fs::directory_iterator(dir_), fs::directory_iterator()), 2);

    // Clouds the XML encoding cannot carry are refused before anything is written.
    PointCloud bad = small;
    bad.header().description = "\xff\xfe";
    std::string out =
        oxtest::captureOutput([&] { EXPECT_FALSE(ox::writePointCloud("old.xml", bad)); });
    EXPECT_NE(out.find("the description is not text XML can hold"), std::string::npos) << out;
    PointCloud spaced;
    spaced.addVariable("has space", ox::PointDataType::Float, 1);
    out = oxtest::captureOutput([&] { EXPECT_FALSE(ox::writePointCloud("old.xml", spaced)); });
    EXPECT_NE(out.find("cannot be an XML element name"), std::string::npos) << out;
}

}  // namespace
