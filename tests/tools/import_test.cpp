#include <assimp/postprocess.h>
#include <assimp/scene.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <assimp/Importer.hpp>
#include <cmath>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "scene/loader.h"
#include "scene/scene.h"
#include "scene/vtm.h"
#include "tests/support/test_support.h"
#include "tools/import_command.h"
#include "tools/model_reader.h"

namespace fs = std::filesystem;
using namespace std::string_literals;

namespace {

const std::string kImport = std::string(OX_BINARY_DIR) + "/tools/thevorn-import";

using oxtest::RunResult;

// Runs thevorn-import with the arguments; stdout and stderr together.
RunResult runImport(const std::string &args) { return oxtest::runProgram(kImport, args); }

using oxtest::readFile;
using oxtest::writeFile;

// Exactly one error line in a program's output.
bool oneError(const std::string &out) {
    return out.find("[ERROR]") != std::string::npos && out.find("[ERROR]") == out.rfind("[ERROR]");
}

// Each test runs in its own working directory, so files are named relative to it.
class ImportTest : public oxtest::TempDirTest {
protected:
    ImportTest() : TempDirTest("thevorn_import_") {}
};

// The same little glTF scene in every test that needs two UV sets: one quad with normals, two
// UV sets, vertex colours and a base colour texture (at imageUri), a camera and a spot light;
// `twice` places the quad a second time. Its buffer is written to quad.bin.
std::string gltfQuad(const std::string &imageUri = "tiles.png", bool twice = false) {
    const float pos[] = {0, 0, 0, 2, 0, 0, 2, 1, 0, 0, 1, 0};
    const float nrm[] = {0, 0, 1, 0, 0, 1, 0, 0, 1, 0, 0, 1};
    const float uv0[] = {0, 0, 1, 0, 1, 1, 0, 1};
    const float uv1[] = {0.1f, 0.1f, 0.4f, 0.1f, 0.4f, 0.4f, 0.1f, 0.4f};
    const float col[] = {1, 0, 0, 1, 0, 1, 0, 1, 0, 0, 1, 1, 1, 1, 1, 0.5f};
    const uint16_t idx[] = {0, 1, 2, 0, 2, 3};
    std::string bin;
    auto add = [&](const void *d, size_t n) { bin.append(static_cast<const char *>(d), n); };
    add(pos, sizeof pos), add(nrm, sizeof nrm), add(uv0, sizeof uv0), add(uv1, sizeof uv1);
    add(col, sizeof col), add(idx, sizeof idx);
    writeFile("quad.bin", bin);
    std::ostringstream g;
    g << R"({"asset":{"version":"2.0"},"scene":0,"scenes":[{"nodes":[0,1,2)" << (twice ? ",3" : "")
      << R"(]}],
"nodes":[{"name":"Quad","mesh":0,"translation":[1,2,3]},
 {"name":"Cam","camera":0,"translation":[0,1,5]},
 {"name":"Spot","extensions":{"KHR_lights_punctual":{"light":0}},"translation":[0,4,0],
  "rotation":[-0.70710678,0,0,0.70710678]})"
      << (twice ? R"(,{"name":"Again","mesh":0,"translation":[-4,0,0],"scale":[1,2,1]})" : "")
      << R"(],
"extensionsUsed":["KHR_lights_punctual"],
"extensions":{"KHR_lights_punctual":{"lights":[{"type":"spot","color":[1,0.5,0.25],
 "intensity":2,"spot":{"innerConeAngle":0.25,"outerConeAngle":0.5}}]}},
"cameras":[{"type":"perspective","perspective":{"yfov":0.8,"aspectRatio":1.0,"znear":0.1}}],
"meshes":[{"name":"QuadMesh","primitives":[{"attributes":{"POSITION":0,"NORMAL":1,
 "TEXCOORD_0":2,"TEXCOORD_1":3,"COLOR_0":4},"indices":5,"material":0}]}],
"materials":[{"name":"Tiles","pbrMetallicRoughness":{"baseColorFactor":[0.5,0.6,0.7,1],
 "baseColorTexture":{"index":0}},"emissiveFactor":[0.25,0,0]}],
"textures":[{"source":0}],"images":[{"uri":")"
      << imageUri << R"("}],
"buffers":[{"byteLength":)"
      << bin.size() << R"(,"uri":"quad.bin"}],
"bufferViews":[{"buffer":0,"byteOffset":0,"byteLength":48},{"buffer":0,"byteOffset":48,"byteLength":48},
 {"buffer":0,"byteOffset":96,"byteLength":32},{"buffer":0,"byteOffset":128,"byteLength":32},
 {"buffer":0,"byteOffset":160,"byteLength":64},{"buffer":0,"byteOffset":224,"byteLength":12}],
"accessors":[{"bufferView":0,"componentType":5126,"count":4,"type":"VEC3","min":[0,0,0],"max":[2,1,0]},
 {"bufferView":1,"componentType":5126,"count":4,"type":"VEC3"},
 {"bufferView":2,"componentType":5126,"count":4,"type":"VEC2"},
 {"bufferView":3,"componentType":5126,"count":4,"type":"VEC2"},
 {"bufferView":4,"componentType":5126,"count":4,"type":"VEC4"},
 {"bufferView":5,"componentType":5123,"count":6,"type":"SCALAR"}]})";
    return g.str();
}

// Loads the inputs and every mesh file of an import's output folder.
bool loadImported(const std::string &out, std::vector<std::string> inputs, ox::Scene &scene) {
    for (const auto &e : fs::directory_iterator(out))
        if (e.path().extension() == ".vtm") inputs.push_back(e.path().string());
    std::string error;
    const bool ok = ox::ZPXLoader().load(inputs, ox::SceneLoadSettings(), scene, error);
    EXPECT_TRUE(ok) << error;
    return ok;
}

}  // namespace

// One triangle with a UV set and a normal: every value of the mesh file, and the scene file
// byte for byte.
TEST_F(ImportTest, WritesTheMeshAndSceneFiles) {
    writeFile("tri.obj",
              "o tri\nv 0 0 0\nv 2 0 0\nv 0 1 0\nvt 0 0\nvt 1 0\nvt 0 1\nvn 0 0 1\n"
              "f 1/1/1 2/2/1 3/3/1\n");
    RunResult r = runImport("tri.obj -o out");
    ASSERT_EQ(r.status, 0) << r.output;

    // The mesh file's layout has its own tests; here its content. Without colours the file is
    // of version 1.
    auto reader = vtm::TempMeshReaderFactory::instance().open("out/tri.vtm");
    ASSERT_TRUE(reader);
    EXPECT_EQ(reader->version(), 1u);
    vtm::TempMesh m;
    ASSERT_TRUE(vtm::readTempMesh("out/tri.vtm", m));
    EXPECT_EQ(m.name, "tri");
    EXPECT_EQ(m.uvSetNames, std::vector<std::string>{"uv0"});
    EXPECT_EQ(m.groups, (std::vector<vtm::MaterialGroup>{{"DefaultMaterial", 1}}));
    EXPECT_EQ(m.bounds, ox::BBox(ox::Vec3(0, 0, 0), ox::Vec3(2, 1, 0)));
    // Position, normal, tangent (along u) and bitangent (along v) per vertex.
    EXPECT_EQ(m.vertices, (std::vector<float>{0, 0, 0, 0, 0, 1, 1, 0, 0, 0, 1, 0,  //
                                              2, 0, 0, 0, 0, 1, 1, 0, 0, 0, 1, 0,  //
                                              0, 1, 0, 0, 0, 1, 1, 0, 0, 0, 1, 0}));
    EXPECT_EQ(m.uvs, (std::vector<float>{0, 0, 1, 0, 0, 1}));
    EXPECT_EQ(m.indices, (std::vector<uint32_t>{0, 1, 2}));

    // The scene file, as the settings writer lays out the scene objects: the default material
    // of the reader (grey diffuse) and one instance placing the shape with the identity.
    EXPECT_EQ(readFile("out/tri.xml"),
              readFile(std::string(OX_TEST_DATA_DIR) + "/tools/tri_scene.xml"));
}

// Two UV sets in order, vertex colours (version 2 file), a texture reference, node placement,
// a camera and a spot light from a glTF scene.
TEST_F(ImportTest, KeepsUvSetsColoursTexturesCamerasAndLights) {
    writeFile("quad.gltf", gltfQuad());
    writeFile("tiles.png", "not really an image");
    RunResult r = runImport("quad.gltf -o out --prefix lvl_");
    ASSERT_EQ(r.status, 0) << r.output;

    vtm::TempMesh mesh;
    std::string error;
    ASSERT_TRUE(vtm::readTempMesh("out/lvl_Quad.vtm", mesh, &error)) << error;
    EXPECT_TRUE(mesh.colors);  // only a version 2 file carries colours
    EXPECT_EQ(mesh.name, "lvl_Quad");
    EXPECT_EQ(mesh.uvSetNames, (std::vector<std::string>{"uv0", "uv1"}));
    EXPECT_EQ(mesh.groups, (std::vector<vtm::MaterialGroup>{{"lvl_Tiles", 2}}));
    ASSERT_EQ(mesh.vertexCount(), 4u);
    EXPECT_EQ(mesh.bounds, ox::BBox(ox::Vec3(0, 0, 0), ox::Vec3(2, 1, 0)));
    // Every vertex keeps its colour and both UV pairs together (glTF's v runs downwards, the
    // reader turns it over).
    for (uint32_t v = 0; v < 4; ++v) {
        const float *f = &mesh.vertices[v * 16];
        const float *uv = &mesh.uvs[v * 4];
        const float x = f[0], y = f[1];
        EXPECT_FLOAT_EQ(uv[0], x / 2) << v;
        EXPECT_FLOAT_EQ(uv[1], 1 - y) << v;
        EXPECT_FLOAT_EQ(uv[2], 0.1f + 0.3f * x / 2) << v;
        EXPECT_FLOAT_EQ(uv[3], 1 - (0.1f + 0.3f * y)) << v;
        const float expectRed = (x == 0 && y == 0) ? 1.0f : (x == 0 && y == 1) ? 1.0f : 0.0f;
        EXPECT_FLOAT_EQ(f[12], expectRed) << v;
        EXPECT_FLOAT_EQ(f[15], (x == 0 && y == 1) ? 0.5f : 1.0f) << v;
        // The normal is +z; the tangent frame was computed and is perpendicular to it.
        EXPECT_FLOAT_EQ(f[5], 1.0f);
        EXPECT_NEAR(f[6] * f[3] + f[7] * f[4] + f[8] * f[5], 0.0f, 1e-5f);
        EXPECT_NEAR(f[6] * f[6] + f[7] * f[7] + f[8] * f[8], 1.0f, 1e-4f);
    }

    // The scene file: the material with its texture, the placement (translation (1, 2, 3) in
    // the last row of the instance matrix), the camera and the light.
    const std::string xml = readFile("out/quad.xml");
    for (const std::string &want :
         {"<Name>lvl_Tiles</Name>"s,
          "<FileTexture>" + fs::canonical("tiles.png").string() + "</FileTexture>",
          "<UseVertexColor>false</UseVertexColor>"s,
          "<r>\n\t\t\t\t<c>1</c>\n\t\t\t\t<c>2</c>\n\t\t\t\t<c>3</c>\n\t\t\t\t<c>1</c>"s,
          "<Name>lvl_Cam</Name>"s, "<Type>SPOT</Type>"s})
        EXPECT_NE(xml.find(want), std::string::npos) << want << "\n" << xml;

    // The library view of the same file, in scene terms.
    ox::ImportedModel model;
    ox::ImportStats stats;
    ASSERT_TRUE(ox::readModel("quad.gltf", ox::ImportOptions(), model, stats));
    ASSERT_EQ(model.cameras.size(), 1u);
    const ox::Mtx4 &cam = model.cameras[0].objectToWorld;
    EXPECT_FLOAT_EQ(cam.m[3][1], 1.0f);  // at (0, 1, 5), looking along -z
    EXPECT_FLOAT_EQ(cam.m[3][2], 5.0f);
    EXPECT_FLOAT_EQ(cam.m[2][2], 1.0f);
    ASSERT_EQ(model.lights.size(), 1u);
    const ox::ImportedLight &spot = model.lights[0];
    EXPECT_EQ(spot.type, ox::ImportedLightType::kSpot);
    EXPECT_FLOAT_EQ(spot.color.g, 1.0f);  // colour times intensity
    // Turned to shine down: local -y maps to world -y. Cone angles are full angles in degrees.
    EXPECT_NEAR(spot.objectToWorld.transformVector(ox::Vec3(0, -1, 0)).y, -1.0f, 1e-5f);
    EXPECT_NEAR(spot.objectToWorld.determinant3(), 1.0f, 1e-5f);
    EXPECT_NEAR(spot.objectToWorld.m[3][1], 4.0f, 1e-5f);
    EXPECT_NEAR(spot.coneAngleDegrees, 28.6479f, 1e-3f);
    EXPECT_NEAR(spot.penumbraAngleDegrees, 14.3239f, 1e-3f);
    EXPECT_FLOAT_EQ(model.materials[0].emissive.color.r, 0.25f);
    EXPECT_EQ(model.materials[0].emissive.scale, 1.0f);
}

// An image stored inside the model is written beside the scene, byte for byte, and the material
// names that file.
TEST_F(ImportTest, EmbeddedImagesBecomeFiles) {
    writeFile("packed.gltf", gltfQuad("data:image/png;base64,iVBORy1pc2g="));  // "\x89PNG-ish"
    RunResult r = runImport("packed.gltf -o out");
    ASSERT_EQ(r.status, 0) << r.output;
    const fs::path image = fs::path("out") / "textures" / "packed_texture0.png";
    EXPECT_EQ(readFile(image), "\x89PNG-ish");
    EXPECT_NE(readFile("out/packed.xml")
                  .find("<FileTexture>" + fs::canonical(image).string() + "</FileTexture>"),
              std::string::npos);
    // The image is an output like the others: kept unless --force.
    fs::remove("out/packed.xml");
    fs::remove("out/Quad.vtm");
    r = runImport("packed.gltf -o out");
    EXPECT_EQ(r.status, ox::kImportWouldOverwrite) << r.output;
    EXPECT_FALSE(fs::exists("out/packed.xml"));
}

// Vertex colours of a PLY scan give a version 2 file and a material that uses them.
TEST_F(ImportTest, PlyVertexColours) {
    writeFile("scan.ply",
              "ply\nformat ascii 1.0\nelement vertex 3\nproperty float x\nproperty float y\n"
              "property float z\nproperty uchar red\nproperty uchar green\nproperty uchar blue\n"
              "element face 1\nproperty list uchar int vertex_indices\nend_header\n"
              "0 0 0 255 0 0\n1 0 0 0 255 0\n0 1 0 0 0 51\n3 0 1 2\n");
    RunResult r = runImport("scan.ply -o out");
    ASSERT_EQ(r.status, 0) << r.output;
    vtm::TempMesh mesh;
    ASSERT_TRUE(vtm::readTempMesh("out/scan.vtm", mesh));
    ASSERT_TRUE(mesh.colors);
    ASSERT_EQ(mesh.vertexCount(), 3u);
    EXPECT_FLOAT_EQ(mesh.vertices[12], 1.0f);
    EXPECT_FLOAT_EQ(mesh.vertices[16 + 13], 1.0f);
    EXPECT_FLOAT_EQ(mesh.vertices[32 + 14], 0.2f);
    EXPECT_TRUE(mesh.uvSetNames.empty());
    EXPECT_NE(readFile("out/scan.xml").find("<UseVertexColor>true</UseVertexColor>"),
              std::string::npos);
}

// Bad faces are dropped or triangulated with counts; the rest of the model comes through.
TEST_F(ImportTest, DegenerateInputIsCountedNotFatal) {
    writeFile("bad.obj",
              "v 0 0 0\nv 1 0 0\nv 1 1 0\nv 0 1 0\nv nan 0 1\n"
              "f 1 2 3 4\n"  // a quad: two triangles
              "f 1 2 9\n"    // index out of range
              "f 1 -9 2\n"   // relative index out of range
              "f 1 2 5\n"    // NaN corner
              "l 1 3\n"      // a line
              "f 2 3 4 # a comment, which the reader would refuse\n");
    RunResult r = runImport("bad.obj --list");
    ASSERT_EQ(r.status, 0) << r.output;
    for (const char *want :
         {"Dropped 2 faces with vertex indices out of range",
          "Dropped 1 faces with NaN or infinite positions", "Dropped 1 points and lines",
          "Triangulated 1 polygons", "Shapes: 1 (3 triangles)"})
        EXPECT_NE(r.output.find(want), std::string::npos) << want << "\n" << r.output;

    // Nothing usable at all: no crash; the listing shows an empty model, the import refuses it.
    writeFile("none.obj", "v 0 0 0\nv 1 0 0\nf 1 2 7\n");
    r = runImport("none.obj --list");
    EXPECT_EQ(r.status, 0) << r.output;
    EXPECT_NE(r.output.find("Shapes: 0"), std::string::npos) << r.output;
    r = runImport("none.obj -o none");
    EXPECT_EQ(r.status, 1) << r.output;
    EXPECT_FALSE(fs::exists("none"));
}

// A file that is no model: one error, a non-zero status, nothing written.
TEST_F(ImportTest, UnreadableModelGivesOneError) {
    writeFile("junk.fbx", std::string(300, '\x17') + "not a model");
    const std::string out = " -o out";
    const struct {
        std::string args;
        int status;
        const char *text;
    } cases[] = {{"junk.fbx" + out, ox::kImportFailed, "Cannot read model"},
                 {"missing.obj" + out, ox::kImportFailed, "[ERROR]"},
                 {"junk.fbx --scale -2" + out, ox::kImportUsage, "Usage: thevorn-import"},
                 {"junk.fbx", ox::kImportUsage, "Usage: thevorn-import"}};
    for (const auto &c : cases) {
        RunResult r = runImport(c.args);
        EXPECT_EQ(r.status, c.status) << c.args;
        EXPECT_NE(r.output.find(c.text), std::string::npos) << r.output;
        // One error for a failure.
        EXPECT_TRUE(c.status != ox::kImportFailed || oneError(r.output)) << r.output;
    }
    EXPECT_FALSE(fs::exists("out"));
}

// Files that once crashed, hung or exhausted the import: each is a clean error, or a correct
// import of what is usable, and nothing is written on failure.
TEST_F(ImportTest, HostileModelsFailCleanly) {
    const std::string data = std::string(OX_TEST_DATA_DIR) + "/tools/hostile/";
    // A chain of nodes 10,000 deep, with a camera at the bottom one unit above its parent each.
    {
        std::ostringstream g;
        g << R"({"asset":{"version":"2.0"},"scene":0,"scenes":[{"nodes":[0]}],)"
          << R"("cameras":[{"type":"perspective","perspective":{"yfov":0.8,"znear":0.1}}],)"
          << R"("nodes":[)";
        for (int i = 0; i < 10000; ++i)
            g << R"({"translation":[0,1,0],"children":[)" << i + 1 << "]},";
        g << R"({"name":"Deep","camera":0}]})";
        writeFile("deep.gltf", g.str());
    }
    // One face of 100,000 corners.
    {
        std::string obj;
        for (int i = 0; i < 100000; ++i)
            obj += "v " + std::to_string(std::cos(i * 6.2831853e-5)) + " " +
                   std::to_string(std::sin(i * 6.2831853e-5)) + " 0\n";
        obj += "v 0 0 1\nv 1 0 1\nv 0 1 1\nf 100001 100002 100003\nf";
        for (int i = 1; i <= 100000; ++i) obj += " " + std::to_string(i);
        writeFile("huge_face.obj", obj + "\n");
    }
    const std::string kTooLarge = "more than the file's";
    const struct {
        std::string args;
        int status;
        std::vector<std::string> texts;
    } cases[] = {
        // A quad dropped for its NaN corner used to leave the mesh marked as holding polygons.
        {data + "nan_quad.obj --list",
         ox::kImportOk,
         {"Dropped 1 faces with NaN or infinite positions", "Shapes: 0"}},
        {"deep.gltf --list", ox::kImportOk, {"Deep: perspective at (0, 10000, 0)"}},
        {"huge_face.obj --list --lightmap-uv 64",
         ox::kImportOk,
         {"Dropped 1 polygons of more than 1024 corners", "Shapes: 1 (1 triangles)"}},
        {data + "json_chunk_claims_4g.glb -o out",
         ox::kImportFailed,
         {"chunk 0 declares 4294967280 bytes, more than the file holds"}},
        {data + "vertices_2_30.ply -o out",
         ox::kImportFailed,
         {"declares 1073741824 elements vertex, " + kTooLarge}},
        {data + "vertices_2_32.ply -o out",
         ox::kImportFailed,
         {"declares 4294967296 elements vertex, " + kTooLarge}},
        {data + "ascii_vertices_2_30.ply -o out",
         ox::kImportFailed,
         {"declares 1073741824 elements vertex, " + kTooLarge}},
        {data + "long_newmtl.obj --list", ox::kImportOk, {"Shapes: 1 (1 triangles)"}},
        // The library's reader looped without end on a header that never ends, with a
        // property of an unknown type in it.
        {data + "endless_header.ply --list", ox::kImportFailed, {"the header has no end"}},
        // The library took it for a PLY file by its first three letters and spent minutes on
        // a vertex count it read from "107~3741824", with an "end_header" spoilt.
        {data + "ply_magic_only.ply --list", ox::kImportFailed, {"the header has no end"}},
        // "end_header" inside a property line: the library read on past it and never ended.
        {data + "end_header_inline.ply --list", ox::kImportFailed, {"the header has no end"}},
        // Its material library sets a colour before naming any material: the library's reader
        // crashed on it.
        {data + "mtl_before_newmtl.obj --list",
         ox::kImportOk,
         {"Shapes: 1", "blue: diffuse (0, 0, 1)"}},
    };
    for (const auto &c : cases) {
        // A hang shows as the status of timeout.
        RunResult r = oxtest::runProgram("timeout 300 " + kImport, c.args);
        EXPECT_EQ(r.status, c.status) << c.args << "\n" << r.output;
        for (const std::string &text : c.texts)
            EXPECT_NE(r.output.find(text), std::string::npos) << c.args << ": " << text << "\n"
                                                              << r.output;
        EXPECT_TRUE(c.status != ox::kImportFailed || oneError(r.output)) << r.output;
    }
    EXPECT_FALSE(fs::exists("out"));
}

// Named pipes are refused at once wherever a model names a file: as the model, as an OBJ's
// material library and as a glTF buffer.
TEST_F(ImportTest, PipesAreRefusedNotWaitedOn) {
    for (const char *pipe : {"pipe.obj", "pipe.mtl", "pipe.bin"})
        ASSERT_EQ(mkfifo(pipe, 0600), 0) << pipe;
    writeFile("tri.obj", "mtllib pipe.mtl\nv 0 0 0\nv 1 0 0\nv 0 1 0\nusemtl red\nf 1 2 3\n");
    writeFile("buf.gltf",
              R"({"asset":{"version":"2.0"},"buffers":[{"uri":"pipe.bin","byteLength":36}],)"
              R"("bufferViews":[{"buffer":0,"byteLength":36}],"accessors":[{"bufferView":0,)"
              R"("componentType":5126,"count":3,"type":"VEC3","min":[0,0,0],"max":[1,1,0]}],)"
              R"("meshes":[{"primitives":[{"attributes":{"POSITION":0}}]}],"nodes":[{"mesh":0}],)"
              R"("scenes":[{"nodes":[0]}],"scene":0})");
    RunResult r = oxtest::runProgram("timeout 120 " + kImport, "pipe.obj --list");
    EXPECT_EQ(r.status, ox::kImportFailed) << r.output;
    EXPECT_NE(r.output.find("Cannot read model pipe.obj: not a regular file"), std::string::npos)
        << r.output;
    r = oxtest::runProgram("timeout 120 " + kImport, "tri.obj --list");
    EXPECT_EQ(r.status, ox::kImportOk) << r.output;
    EXPECT_NE(r.output.find("pipe.mtl: not a regular file"), std::string::npos) << r.output;
    EXPECT_NE(r.output.find("Shapes: 1 (1 triangles)"), std::string::npos) << r.output;
    r = oxtest::runProgram("timeout 120 " + kImport, "buf.gltf --list");
    EXPECT_EQ(r.status, ox::kImportFailed) << r.output;
    EXPECT_NE(r.output.find("pipe.bin: not a regular file"), std::string::npos) << r.output;
}

// A model read from memory never touches the disk: its side files come from the given reader
// only, whatever exists in the working directory.
TEST_F(ImportTest, ReadingFromMemoryReadsNoSideFileFromTheDisk) {
    writeFile("side.mtl", "newmtl red\nKd 1 0 0\n");
    const std::string obj = "mtllib side.mtl\nv 0 0 0\nv 1 0 0\nv 0 1 0\nusemtl red\nf 1 2 3\n";
    writeFile("side.obj", obj);
    ox::ImportedModel fromDisk, alone, withReader;
    ox::ImportStats stats;
    ASSERT_TRUE(ox::readModel("side.obj", {}, fromDisk, stats));
    ASSERT_TRUE(ox::readModelFromMemory("side.obj", obj, {}, alone, stats));
    std::vector<std::string> asked;
    ASSERT_TRUE(ox::readModelFromMemory("side.obj", obj, {}, withReader, stats,
                                        [&](const std::string &name, std::string &bytes) {
                                            asked.push_back(name);
                                            bytes = "newmtl red\nKd 0 1 0\n";
                                            return true;
                                        }));
    const auto diffuse = [](const ox::ImportedModel &m) {
        EXPECT_EQ(m.materials.size(), 1u);
        return m.materials.empty() ? ox::Color() : m.materials[0].diffuse.color;
    };
    EXPECT_EQ(diffuse(fromDisk).r, 1.0f);
    EXPECT_NE(diffuse(alone).r, 1.0f);
    EXPECT_EQ(diffuse(withReader).g, 1.0f);
    EXPECT_FALSE(asked.empty());
}

// The memory limit: sizes in MiB or with a suffix; too small or malformed is a usage error; a
// model that needs more than the limit ends with a clean "out of memory".
TEST_F(ImportTest, MemoryLimit) {
    const struct {
        const char *value;
        uint64_t bytes;
    } good[] = {
        {"64", 64ull << 20}, {"512M", 512ull << 20}, {"4G", 4ull << 30}, {"2g", 2ull << 30}};
    for (const auto &g : good) {
        ox::ImportCommand c;
        bool help = false;
        ASSERT_TRUE(ox::parseImportCommand({"m.obj", "--list", "--max-memory", g.value}, c, help))
            << g.value;
        EXPECT_EQ(c.maxMemoryBytes, g.bytes) << g.value;
    }
    for (const char *bad : {"63", "0", "-5", "4T", "G", "1.5G", "99999999999999G"}) {
        RunResult r = runImport(std::string("m.obj --list --max-memory ") + bad);
        EXPECT_EQ(r.status, ox::kImportUsage) << bad;
        EXPECT_NE(r.output.find("Memory limit must be at least 64 MiB"), std::string::npos) << bad;
    }
    EXPECT_GE(ox::defaultImportMemoryLimit(), ox::kMinImportMemoryBytes);
#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__)
    // Half a million separate triangles take far more than 64 MiB once read.
    std::string obj;
    for (int i = 0; i < 500000; ++i) obj += "v " + std::to_string(i) + " 0 0\n";
    for (int i = 1; i + 2 <= 500000; i += 3)
        obj += "f " + std::to_string(i) + " " + std::to_string(i + 1) + " " +
               std::to_string(i + 2) + "\n";
    writeFile("big.obj", obj);
    RunResult r = runImport("big.obj -o out --max-memory 64");
    EXPECT_EQ(r.status, ox::kImportFailed) << r.output;
    EXPECT_TRUE(oneError(r.output)) << r.output;
    EXPECT_NE(r.output.find("out of memory"), std::string::npos) << r.output;
    EXPECT_FALSE(fs::exists("out"));
#endif
}

// Existing files are kept unless --force is given; a refusal writes nothing at all.
TEST_F(ImportTest, RefusesToOverwrite) {
    writeFile("a.obj",
              "o a\nv 0 0 0\nv 1 0 0\nv 0 1 0\nf 1 2 3\no b\nv 0 0 1\nv 1 0 1\n"
              "v 0 1 1\nf 4 5 6\n");
    ASSERT_EQ(runImport("a.obj -o out").status, 0);
    writeFile("out/b.vtm", "mine");
    const std::string sceneBefore = readFile("out/a.xml");
    fs::remove("out/a.vtm");
    RunResult r = runImport("a.obj -o out --scale 2");
    EXPECT_EQ(r.status, ox::kImportWouldOverwrite) << r.output;
    EXPECT_NE(r.output.find("Refusing to overwrite"), std::string::npos);
    EXPECT_FALSE(fs::exists("out/a.vtm"));
    EXPECT_EQ(readFile("out/b.vtm"), "mine");

    r = runImport("a.obj -o out --scale 2 --force");
    EXPECT_EQ(r.status, 0) << r.output;
    vtm::TempMesh mesh;
    ASSERT_TRUE(vtm::readTempMesh("out/b.vtm", mesh));
    EXPECT_EQ(mesh.bounds.max, ox::Vec3(2, 2, 2));
    EXPECT_EQ(readFile("out/a.xml"), sceneBefore);
    // No temporary files stay behind.
    for (const auto &e : fs::directory_iterator("out"))
        EXPECT_NE(e.path().filename().string()[0], '.') << e.path();
}

// Unit scale, up axis, handedness and welding change the geometry as a user expects.
TEST_F(ImportTest, UnitsAxesHandednessAndWelding) {
    writeFile("m.obj", "o m\nv 0 0 0\nv 10 0 0\nv 10 20 30\nv 0 20 30\nf 1 2 3\nf 1 3 4\n");
    ox::ImportOptions o;
    ox::ImportedModel model;
    ox::ImportStats stats;
    o.unitScale = 0.1f;
    o.upAxis = ox::UpAxis::kZ;
    ASSERT_TRUE(ox::readModel("m.obj", o, model, stats));
    ASSERT_EQ(model.shapes.size(), 1u);
    ox::BBox b = model.shapes[0].bounds();
    // z up becomes y up: (x, y, z) -> (x, z, -y), then scaled.
    EXPECT_LT((b.min - ox::Vec3(0, 0, -2)).length(), 1e-5f);
    EXPECT_LT((b.max - ox::Vec3(1, 3, 0)).length(), 1e-5f);
    EXPECT_EQ(model.shapes[0].positions.size(), 4u);

    // Mirrored: z is negated and the winding turns, so the face normal and the stored vertex
    // normal still agree.
    o = ox::ImportOptions();
    o.flipHandedness = true;
    o.weld = false;
    ASSERT_TRUE(ox::readModel("m.obj", o, model, stats));
    const ox::ImportedShape &s = model.shapes[0];
    EXPECT_EQ(s.positions.size(), 6u);  // no welding: three vertices per triangle
    EXPECT_NEAR(s.bounds().min.z, -30, 1e-5);
    const auto &idx = s.groups[0].indices;
    ox::Vec3 n = ox::cross(s.positions[idx[1]] - s.positions[idx[0]],
                           s.positions[idx[2]] - s.positions[idx[0]]);
    EXPECT_GT(ox::dot(n, s.normals[idx[0]]), 0.0f);
}

// Round trip: the written files hold as many triangles, the same box and the same UV sets as
// the asset library reports for the model itself.
TEST_F(ImportTest, RoundTripMatchesTheLibrary) {
    writeFile("tiles.png", "x");
    writeFile("boxes.obj",
              "o box\nv -1 -1 -1\nv 1 -1 -1\nv 1 1 -1\nv -1 1 -1\nv -1 -1 1\nv 1 -1 1\nv 1 1 1\n"
              "v -1 1 1\nf 1 4 3 2\nf 5 6 7 8\nf 1 2 6 5\nf 3 4 8 7\nf 2 3 7 6\nf 1 5 8 4\n"
              "o plane\nv -5 -1 -5\nv 5 -1 -5\nv 5 -1 5\nv -5 -1 5\nf 9 12 11 10\n");
    writeFile("twice.gltf", gltfQuad("tiles.png", true));  // one shape, two instances
    for (const std::string file : {"boxes.obj", "twice.gltf"}) {
        // What the library reports, with every node's placement applied.
        Assimp::Importer importer;
        const aiScene *scene =
            importer.ReadFile(file, aiProcess_Triangulate | aiProcess_PreTransformVertices);
        ASSERT_TRUE(scene) << importer.GetErrorString();
        size_t libTriangles = 0;
        ox::BBox libBox;
        unsigned libUvSets = 0;
        for (unsigned m = 0; m < scene->mNumMeshes; ++m) {
            const aiMesh *mesh = scene->mMeshes[m];
            libTriangles += mesh->mNumFaces;
            libUvSets = std::max(libUvSets, mesh->GetNumUVChannels());
            for (unsigned v = 0; v < mesh->mNumVertices; ++v)
                libBox.extend(
                    ox::Vec3(mesh->mVertices[v].x, mesh->mVertices[v].y, mesh->mVertices[v].z));
        }
        const bool lightmap = libUvSets < 2;

        const std::string out = "out_" + file;
        RunResult r = runImport(file + " -o " + out + (lightmap ? " --lightmap-uv 64" : ""));
        ASSERT_EQ(r.status, 0) << r.output;
        // Every mesh file keeps the UV sets; a generated light-map set lies inside the unit
        // square.
        for (const auto &e : fs::directory_iterator(out)) {
            if (e.path().extension() != ".vtm") continue;
            vtm::TempMesh mesh;
            ASSERT_TRUE(vtm::readTempMesh(e.path().string(), mesh)) << e.path();
            EXPECT_EQ(mesh.uvSetNames.size(), lightmap ? 2u : libUvSets) << e.path();
            if (!lightmap) continue;
            EXPECT_EQ(mesh.uvSetNames[1], "lightmap");
            for (uint32_t v = 0; v < mesh.vertexCount(); ++v) {
                float u = mesh.uvs[v * 4 + 2], w = mesh.uvs[v * 4 + 3];
                EXPECT_TRUE(u > 0 && u < 1 && w > 0 && w < 1) << u << " " << w;
            }
        }
        // The scene loader takes the files as they stand, with every instance placed.
        ox::Scene loaded;
        ASSERT_TRUE(loadImported(
            out, {(fs::path(out) / (fs::path(file).stem().string() + ".xml")).string()}, loaded));
        size_t triangles = 0;
        for (const auto &instance : loaded.instances())
            triangles += instance->shape().triangles().size();
        EXPECT_EQ(triangles, libTriangles) << file;
        EXPECT_EQ(loaded.instanceBounds(), libBox) << file;
        if (file == "twice.gltf") {
            EXPECT_EQ(loaded.instances().size(), 2u);
            EXPECT_EQ(loaded.shapes().size(), 1u);
        }
    }
}

// The Cornell box example imports and loads: its walls, blocks and light patch, the camera and
// the area light of the view file, every shape with its light-map set.
TEST_F(ImportTest, CornellExampleLoads) {
    // The source tree: the test data folder is tests/data in it.
    const std::string example =
        (fs::path(OX_TEST_DATA_DIR).parent_path().parent_path() / "examples" / "cornell").string();
    RunResult r = runImport(example + "/cornell.obj -o out --scale 0.001 --lightmap-uv 256");
    ASSERT_EQ(r.status, 0) << r.output;
    EXPECT_NE(r.output.find("Light-map UVs for tall_block: 5 charts"), std::string::npos)
        << r.output;
    ox::Scene scene;
    ASSERT_TRUE(loadImported("out", {"out/cornell.xml", example + "/cornell_view.xml"}, scene));
    EXPECT_EQ(scene.instances().size(), 8u);
    for (const auto &instance : scene.instances())
        EXPECT_EQ(instance->shape().vertices().uvSetNames(),
                  (std::vector<std::string>{"uv0", "lightmap"}));
    EXPECT_TRUE(scene.findCamera("cornell_camera"));
    EXPECT_TRUE(scene.findLight("cornell_light"));
    EXPECT_TRUE(scene.findShape("light"));
    EXPECT_NEAR(scene.instanceBounds().max.x, 0.556f, 1e-6f);  // millimetres to metres
}

// An opacity map that is the diffuse image makes the diffuse alpha the transparency; another
// opacity map goes into the transparency channel with a warning.
TEST_F(ImportTest, OpacityMaps) {
    writeFile("op.mtl",
              "newmtl leaf\nKd 1 1 1\nmap_Kd leaf.png\nmap_d leaf.png\n"
              "newmtl glass\nKd 1 1 1\nmap_d mask.png\n");
    writeFile("leaf.png", "x");
    writeFile("mask.png", "x");
    writeFile("op.obj",
              "mtllib op.mtl\nv 0 0 0\nv 1 0 0\nv 0 1 0\nvt 0 0\nvt 1 0\nvt 0 1\n"
              "usemtl leaf\nf 1/1 2/2 3/3\nusemtl glass\nf 1/1 3/3 2/2\n");
    ox::ImportedModel model;
    ox::ImportStats stats;
    ASSERT_TRUE(ox::readModel("op.obj", ox::ImportOptions(), model, stats));
    ASSERT_EQ(model.materials.size(), 2u);
    const ox::ImportedMaterial &leaf = model.materials[0], &glass = model.materials[1];
    EXPECT_EQ(leaf.name, "leaf");
    EXPECT_TRUE(leaf.diffuseAlphaAsTransparency);
    EXPECT_TRUE(leaf.transparency.fileTexture.empty());
    EXPECT_FALSE(glass.diffuseAlphaAsTransparency);
    EXPECT_EQ(glass.transparency.fileTexture, fs::canonical("mask.png").string());
    EXPECT_EQ(glass.transparency.scale, 1.0f);
}
