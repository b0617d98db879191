#include "tools/model_checks.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <cstdint>
#include <fstream>
#include <string>

#include "tests/support/test_support.h"

namespace {

std::string u32(uint32_t v) {
    return {char(v & 0xff), char((v >> 8) & 0xff), char((v >> 16) & 0xff), char(v >> 24)};
}

std::string plyHeader(const std::string &format, const std::string &elements) {
    return "ply\nformat " + format + " 1.0\ncomment c\n" + elements + "end_header\n";
}

// What a header or chunk table claims is weighed against the bytes that follow it.
TEST(ModelChecks, DeclaredSizesAgainstTheFile) {
    const std::string xyz = "property float x\nproperty float y\nproperty float z\n";
    const std::string face = "element face 1\nproperty list uchar int vertex_indices\n";
    const std::string binBody = std::string(36, '\0') + '\3' + std::string(12, '\0');
    const std::string glbJson = R"({"asset":{"version":"2.0"}})";
    const std::string glb = "glTF" + u32(2) + u32(20 + 28) + u32(28) + "JSON" + glbJson + " ";
    const struct {
        std::string name, bytes, why;  // why empty: accepted
    } cases[] = {
        {"ascii.ply",
         plyHeader("ascii", "element vertex 3\n" + xyz + face) + "0 0 0\n1 0 0\n0 1 0\n3 0 1 2\n",
         ""},
        {"binary.ply",
         plyHeader("binary_little_endian", "element vertex 3\n" + xyz + face) + binBody, ""},
        // More vertices than the body holds, in either encoding.
        {"binary5.ply",
         plyHeader("binary_little_endian", "element vertex 5\n" + xyz + face) + binBody,
         "the header declares 5 elements vertex, more than the file's 49 bytes can hold"},
        {"ascii.ply", plyHeader("ascii", "element vertex 9\n" + xyz) + "0 0 0\n1 0 0\n0 1 0\n",
         "the header declares 9 elements vertex, more than the file's 18 bytes can hold"},
        {"count.ply", plyHeader("ascii", "element vertex 99999999999999999999\n" + xyz),
         "the header declares a count of 99999999999999999999 elements vertex"},
        {"type.ply", plyHeader("ascii", "element vertex 1\nproperty float128 x\n") + "0\n",
         "the header holds a property of an unknown type in element vertex"},
        {"list.ply", plyHeader("ascii", "element face 1\nproperty list uchar quad i\n") + "0\n",
         "the header holds a property of an unknown type in element face"},
        {"orphan.ply", plyHeader("ascii", "property float x\n"),
         "the header holds a line that is no header line"},
        {"format.ply", plyHeader("binary_middle_endian", ""), "the header names an unknown format"},
        {"open.ply", "ply\nformat ascii 1.0\nelement vertex 1\n", "the header has no end"},
        {"inline.ply", "ply\nformat ascii 1.0\nelement vertex 1\nproperty float xend_header\n0\n",
         "the header has no end"},
        {"spaced.ply", plyHeader("ascii", "element vertex 1\nproperty float x\n") + "0\n", ""},
        // PLY files are recognised by their first line, not by their name.
        {"text.obj", "v 0 0 0\n", ""},
        {"other.ply", "solid stl\n", ""},
        {"named.obj", "ply\r\nformat ascii 1.0\nelement vertex 1\n", "the header has no end"},
        {"magic.ply", "plyAAAA\nformat ascii 1.0\nend_header\n",
         "the header holds a line that is no header line"},
        {"model.glb", glb, ""},
        {"long.glb", "glTF" + u32(2) + u32(4000) + u32(28) + "JSON" + glbJson,
         "the binary header declares 4000 bytes, the file holds 47"},
        {"chunk.glb", "glTF" + u32(2) + u32(48) + u32(0xfffffff0u) + "JSON" + glbJson + " ",
         "chunk 0 declares 4294967280 bytes, more than the file holds"},
        {"second.glb", glb + u32(64) + "BIN" + '\0' + std::string(8, '\0'),
         "chunk 1 declares 64 bytes, more than the file holds"},
        {"v1.glb", "glTF" + u32(1) + u32(24) + u32(1000) + u32(0) + "{}  ",
         "the binary header declares a content of 1000 bytes, more than the file holds"},
    };
    for (const auto &c : cases) {
        std::string why;
        const std::string ext = c.name.substr(c.name.rfind('.'));
        EXPECT_EQ(ox::checkDeclaredSizes(ext, c.bytes, why), c.why.empty()) << c.name;
        EXPECT_EQ(why, c.why) << c.name;
    }
}

class ModelFileTest : public oxtest::TempDirTest {
protected:
    ModelFileTest() : TempDirTest("thevorn_model_file_") {}
};

// Only regular files are read, to their end whatever size they report, and never beyond the cap.
TEST_F(ModelFileTest, ReadsRegularFilesOnlyUpToTheCap) {
    const std::string file = "m.obj", pipe = "p.obj";
    std::ofstream(file) << std::string(5000, 'v');
    ASSERT_EQ(mkfifo(pipe.c_str(), 0600), 0);
    std::string out, why;
    EXPECT_TRUE(ox::readModelFile(file, 5000, out, why));
    EXPECT_EQ(out.size(), 5000u);
    EXPECT_FALSE(ox::readModelFile(file, 4999, out, why));
    EXPECT_EQ(why, "larger than 0 MiB");
    EXPECT_TRUE(out.empty());
    const struct {
        std::string path, why;
    } refused[] = {{pipe, "not a regular file"},
                   {".", "not a regular file"},
                   {"/dev/zero", "not a regular file"},
                   {"missing.obj", "no such file"}};
    for (const auto &r : refused) {
        EXPECT_FALSE(ox::readModelFile(r.path, 1 << 20, out, why)) << r.path;
        EXPECT_EQ(why, r.why) << r.path;
    }
    // /proc files report the size 0 but are read to their end.
    EXPECT_TRUE(ox::readModelFile("/proc/self/status", 1 << 20, out, why));
    EXPECT_NE(out.find("Name:"), std::string::npos);
    EXPECT_FALSE(ox::readModelFile("/proc/self/status", 16, out, why));
}

}  // namespace
