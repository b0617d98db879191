#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "tests/support/test_support.h"

namespace fs = std::filesystem;

namespace {

const std::string kImport = std::string(OX_BINARY_DIR) + "/tools/thevorn-import";

class ImportMessages : public oxtest::TempDirTest {
protected:
    ImportMessages() : TempDirTest("thevorn_import_messages_") {}
};

using oxtest::countOf;
using oxtest::writeFile;

// One triangle and a point light above it, as glTF with its buffer in tri.bin.
std::string gltfTriangleWithLight() {
    const float pos[] = {0, 0, 0, 1, 0, 0, 0, 1, 0};
    writeFile("tri.bin", std::string(reinterpret_cast<const char *>(pos), sizeof pos));
    return R"({"asset":{"version":"2.0"},"scene":0,"scenes":[{"nodes":[0,1]}],
"nodes":[{"mesh":0},{"name":"Lamp","translation":[0,0,3],
 "extensions":{"KHR_lights_punctual":{"light":0}}}],
"meshes":[{"primitives":[{"attributes":{"POSITION":0}}]}],
"accessors":[{"bufferView":0,"componentType":5126,"count":3,"type":"VEC3",
 "min":[0,0,0],"max":[1,1,0]}],
"bufferViews":[{"buffer":0,"byteLength":36}],
"buffers":[{"uri":"tri.bin","byteLength":36}],
"extensionsUsed":["KHR_lights_punctual"],
"extensions":{"KHR_lights_punctual":{"lights":[{"type":"point","color":[1,1,1],
 "intensity":10}]}}})";
}

}  // namespace

TEST_F(ImportMessages, EachSituationGetsOneFittingMessage) {
    const std::string quad = "v 0 0 0\nv 1 0 0\nv 1 1 0\nv 0 1 0\nf 1 2 3 4\n";
    writeFile("quad.obj", quad);
    writeFile("with_missing_mtl.obj", "mtllib missing.mtl\nusemtl red\n" + quad);
    writeFile("lit.gltf", gltfTriangleWithLight());
    // Machine code under a model's name: the OBJ reader finds nothing in it.
    std::string binary(4096, '\0');
    for (size_t i = 0; i < binary.size(); ++i) binary[i] = char((i * 7919u) >> 3);
    writeFile("binary.obj", binary);
    writeFile("lines.obj", "v 0 0 0\nv 1 0 0\nl 1 2\n");

    const struct {
        const char *what;
        std::string args;
        int status;
        std::vector<std::pair<std::string, int>> counts;  // text, how often it appears
    } cases[] = {
        {"quads are triangulated as a matter of course",
         "quad.obj -o q",
         0,
         {{"[INFO]     Triangulated 1 polygons of more than three corners\n", 1},
          {"[WARNING]", 0}}},
        {"a missing material library is named once",
         "with_missing_mtl.obj -o m",
         0,
         {{"missing.mtl", 1}, {"[WARNING]", 1}, {"with_missing_mtl.mtl", 0}}},
        {"a model without lights says so and where to find some",
         "quad.obj -o q2",
         0,
         {{"[INFO]     The model has no lights; add one before baking (README, \"Adding "
           "lights\", has ready LightSource blocks)\n",
           1}}},
        {"a model with a light does not", "lit.gltf -o l", 0, {{"has no lights", 0}}},
        {"a file with no triangles is an error",
         "binary.obj -o b",
         1,
         {{"[ERROR]    The model binary.obj holds no triangles; nothing was written\n", 1},
          {"Wrote", 0}}},
        {"so are points and lines only", "lines.obj -o p", 1, {{"holds no triangles", 1}}},
    };
    for (const auto &c : cases) {
        const oxtest::RunResult r = oxtest::runProgram(kImport, c.args);
        EXPECT_EQ(r.status, c.status) << c.what << "\n" << r.output;
        for (const auto &[text, n] : c.counts)
            EXPECT_EQ(countOf(r.output, text), n) << c.what << ": " << text << "\n" << r.output;
    }
    // A refused model leaves nothing behind, not even its output directory.
    EXPECT_FALSE(fs::exists("b"));
    EXPECT_FALSE(fs::exists("p"));
    EXPECT_TRUE(fs::exists("q/quad.xml"));
}
