#include "scene/loader.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <atomic>
#include <cmath>
#include <fstream>

#include "scene/material_converter.h"
#include "scene_test_util.h"
#include "shading/phong.h"
#include "tests/support/tga_file.h"

namespace ox {
namespace {

using test::captureMessages;
using test::MeshMaker;
using test::TempDir;

// A scene on disk: mesh files and one scene document.
struct SceneFiles {
    TempDir dir;
    std::vector<std::string> inputs;

    void mesh(const std::string &file, const vtm::TempMesh &m) {
        std::string path = dir.file(file);
        ASSERT_TRUE(vtm::writeTempMesh(path, m, 2));
        inputs.push_back(path);
    }
    // A unit quad (two triangles) from (-1, -1, 0) to (1, 1, 0) with one group.
    void quad(const std::string &file, const std::string &shape, const std::string &material,
              std::vector<std::string> uvSets = {"map1"}) {
        MeshMaker m(shape, uint32_t(uvSets.size()));
        m.mesh.uvSetNames = uvSets;
        for (Vec3 p : {Vec3(-1, -1, 0), Vec3(1, -1, 0), Vec3(1, 1, 0), Vec3(-1, 1, 0)}) m.vertex(p);
        m.group(material, {0, 1, 2, 0, 2, 3});
        mesh(file, m.mesh);
    }
    void xml(const std::string &file, const std::string &body) {
        std::string path = dir.file(file);
        std::ofstream(path) << "<?xml version=\"1.0\"?>\n<OXScene>\n" << body << "</OXScene>\n";
        inputs.push_back(path);
    }
};

std::string material(const std::string &name, const std::string &extra = "") {
    return "<Material><Name>" + name + "</Name>" + extra + "</Material>\n";
}
std::string instance(const std::string &name, const std::string &shape,
                     const std::string &extra = "") {
    return "<Instance><Name>" + name + "</Name><Shape>" + shape + "</Shape>" + extra +
           "</Instance>\n";
}
std::string light(const std::string &name, const std::string &type, const std::string &extra = "") {
    return "<LightSource><Name>" + name + "</Name><Type>" + type + "</Type>" + extra +
           "</LightSource>\n";
}

SceneLoadSettings settings(float bias = 0.005f) {
    SceneLoadSettings s;
    s.bias = bias;
    s.threadCount = 2;
    return s;
}

struct LoadResult {
    bool ok = false;
    std::string error, out;
};

LoadResult load(const std::vector<std::string> &inputs, Scene &scene,
                const SceneLoadSettings &s = settings()) {
    LoadResult r;
    ZPXLoader loader;
    r.out = captureMessages([&] { r.ok = loader.load(inputs, s, scene, r.error); });
    return r;
}

TEST(ZPXLoader, LoadsAWholeScene) {
    SceneFiles f;
    f.quad("a.vtm", "plane", "red");
    f.quad("b.vtm", "wall", "blue");
    f.xml("scene.xml",
          material("red") + material("blue") + material("green") + instance("floor", "plane") +
              instance("wall1", "wall",
                       "<MaterialOverrides><element>green</element>"
                       "<element>red</element></MaterialOverrides>") +
              instance("wall2", "wall",
                       "<MaterialOverrides><element>nope</element></MaterialOverrides>"
                       "<RenderStats><CastShadows>false</CastShadows></RenderStats>") +
              light("sun", "DIRECTIONAL") + light("sky", "ENVIRONMENT") +
              light("lamp", "POINT",
                    "<LightLinkMode>INCLUSIVE</LightLinkMode><LightLinkedInstances>"
                    "<element>floor</element><element>ghost</element></LightLinkedInstances>") +
              light("sun", "POINT"));
    Scene scene;
    SceneLoadSettings s = settings();
    s.environment.globalAmbientColor = Color(0.5f, 0.5f, 0.5f, 1);
    LoadResult r = load(f.inputs, scene, s);
    ASSERT_TRUE(r.ok) << r.error << r.out;
    for (const char *want :
         {"[PROGRESS] Loading Scene File", "[BENCH]    ZPX Loading time: ",
          "[BENCH]    Scene bounding box time: ", "[PROGRESS] Progress Title: Creating Temp Shapes",
          "[INFO]     Adding fake camera", "[PROGRESS] Successfully loaded ZPX-File",
          "Failed to find override material nope on instance wall2, using default",
          "Light linked instance ghost not present", "[INFO]     Ray tracing bias: 0.005000",
          "[WARNING]  Duplicate light name sun, keeping the first one"})
        EXPECT_NE(r.out.find(want), std::string::npos) << want;
    EXPECT_EQ(test::countOf(r.out,
                            "Provided more than one material override for instance wall1, "
                            "using only the first for the entire shape"),
              1);

    ASSERT_EQ(scene.shapes().size(), 2u);
    EXPECT_EQ(scene.shapes()[0]->name(), "plane");  // in the order of the inputs
    ASSERT_EQ(scene.instances().size(), 3u);
    const Instance &wall1 = *scene.instances()[1];
    EXPECT_EQ(materialOf(wall1.overrideMaterial())->name(), "green");
    EXPECT_EQ(materialOf(wall1.material(0))->name(), "green");
    EXPECT_EQ(scene.instances()[2]->overrideMaterial(), nullptr);
    EXPECT_EQ(materialOf(scene.instances()[2]->material(0))->name(), "blue");
    EXPECT_FALSE(scene.instances()[2]->hasFlag(0x2));
    ASSERT_NE(scene.instances()[0]->vertexBakeSamplingOptions(), nullptr);

    // Lights: sun (the first one), sky (an environment light that casts shadows), lamp,
    // globalAmbientLight.
    ASSERT_EQ(scene.lights().size(), 4u);
    EXPECT_TRUE(dynamic_cast<const SimpleDirectionalLight *>(scene.lights()[0].get()));
    EXPECT_EQ(scene.lights()[3]->name(), "globalAmbientLight");
    EXPECT_EQ(scene.shadowedEnvironmentLights(), std::vector<uint32_t>{1});
    EXPECT_TRUE(scene.lightReaches(0, 2));
    EXPECT_FALSE(scene.lightReaches(1, 2));
    EXPECT_TRUE(scene.lightReaches(1, 0));

    // The default camera.
    ASSERT_EQ(scene.cameras().size(), 1u);
    const Camera &cam = *scene.cameras()[0];
    EXPECT_EQ(cam.name(), "camera1");
    EXPECT_EQ(cam.position(), Vec3(0, 2, 10));
    EXPECT_FLOAT_EQ(cam.fovX(), 1.0471976f);
    EXPECT_FLOAT_EQ(cam.fovY(), 1.0471976f);
}

TEST(ZPXLoader, CamerasByType) {
    SceneFiles f;
    f.xml("cams.xml",
          "<Camera><Name>p</Name><Fov><x>0.5</x><y>0.25</y></Fov></Camera>"
          "<Camera><Name>o</Name><Type>ORTHO</Type></Camera>"
          "<Camera><Name>e</Name><Type>ENVIRONMENT</Type><EnvironmentType>CUBEMAP</EnvironmentType>"
          "</Camera><Camera><Name>p</Name></Camera>");
    Scene scene;
    LoadResult r = load(f.inputs, scene);
    ASSERT_TRUE(r.ok) << r.error;
    EXPECT_NE(r.out.find("[INFO]     Creating camera: o"), std::string::npos);
    EXPECT_NE(r.out.find("Duplicate camera name p"), std::string::npos);
    EXPECT_EQ(r.out.find("Adding fake camera"), std::string::npos);
    ASSERT_EQ(scene.cameras().size(), 3u);
    EXPECT_FLOAT_EQ(scene.findCamera("p")->fovY(), 0.25f);
    EXPECT_TRUE(dynamic_cast<const OrthoCamera *>(scene.findCamera("o")));
    auto *env = dynamic_cast<const EnvCamera *>(scene.findCamera("e"));
    ASSERT_TRUE(env);
    EXPECT_EQ(env->projection(), EnvCamera::kCubeMap);
}

TEST(ZPXLoader, FileKindsByExtension) {
    SceneFiles f;
    mkdir(f.dir.file("dir.xml").c_str(), 0755);
    std::vector<std::string> inputs = {f.dir.file("upper.XML"), f.dir.file("noext"),
                                       f.dir.file("dir.xml/noext"), f.dir.file("mesh.vtm.bak"),
                                       "/dev/zero"};
    // Inputs that are all skipped leave nothing to load: that is a failure, not an empty scene.
    Scene none;
    LoadResult r = load(inputs, none);
    EXPECT_FALSE(r.ok);
    EXPECT_EQ(r.error, "No scene or mesh file among the inputs");
    EXPECT_NE(r.out.find("[ERROR]    No scene or mesh file among the inputs"), std::string::npos);
    EXPECT_FALSE(load({}, none).ok);

    f.xml("empty.xml", "");
    inputs.push_back(f.inputs.back());
    Scene scene;
    SceneLoadSettings s = settings();
    s.jobKind = 1;  // a texture bake: the default camera comes without the message
    r = load(inputs, scene, s);
    ASSERT_TRUE(r.ok) << r.error;
    for (size_t k = 0; k + 1 < inputs.size(); ++k)
        EXPECT_NE(r.out.find("[WARNING]  Don't know what to do with file: " + inputs[k]),
                  std::string::npos)
            << inputs[k];
    EXPECT_EQ(r.out.find("Adding fake camera"), std::string::npos);
    EXPECT_EQ(fileExtension("a/b.c/d.e"), "e");
    EXPECT_EQ(fileExtension("d."), "");
    EXPECT_EQ(fileExtension(".vtm"), "vtm");
}

TEST(ZPXLoader, AutomaticBias) {
    SceneFiles f;
    f.quad("a.vtm", "cube", "m");
    // The quad spans -1..1 in x and y; instances at z = -1 and z = +1 give the box
    // (-1, -1, -1) .. (1, 1, 1).
    auto at = [](const char *name, const char *z) {
        return instance(name, "cube",
                        std::string("<ObjectToWorld><r><c>1</c></r><r><c>0</c><c>1</c></r><r>"
                                    "<c>0</c><c>0</c><c>1</c></r><r><c>0</c><c>0</c><c>") +
                            z + "</c><c>1</c></r></ObjectToWorld>");
    };
    // A second "low" far away is dropped: the first of a name wins and alone makes the box.
    f.xml("s.xml", material("m") + at("low", "-1") + at("high", "1") + at("low", "9"));
    Scene scene;
    LoadResult r = load(f.inputs, scene, settings(0.0f));
    ASSERT_TRUE(r.ok) << r.error << r.out;
    EXPECT_NEAR(scene.bias(), 3.4641e-5f, 1e-8f);
    EXPECT_NE(r.out.find("Ray tracing bias: 0.000035"), std::string::npos);
    EXPECT_NE(r.out.find("[WARNING]  Duplicate instance name low, keeping the first one"),
              std::string::npos);
    EXPECT_EQ(scene.instances().size(), 2u);

    // No instances: no box for the automatic bias.
    SceneFiles nothing;
    nothing.xml("empty.xml", "");
    Scene empty;
    r = load(nothing.inputs, empty, settings(0.0f));
    ASSERT_TRUE(r.ok);
    EXPECT_EQ(empty.bias(), 0.005f);
    EXPECT_NE(r.out.find("[WARNING]  The scene has no usable bounding box"), std::string::npos);
    for (float bad : {-1.0f, NAN, INFINITY}) {
        Scene other;
        r = load(nothing.inputs, other, settings(bad));
        ASSERT_TRUE(r.ok);
        EXPECT_EQ(other.bias(), 0.005f);
        EXPECT_NE(r.out.find("[WARNING]  Invalid ray tracing bias"), std::string::npos);
    }
    EXPECT_EQ(automaticBias(BBox(Vec3(0, 0, 0), Vec3(NAN, 1, 1))), 0.0f);
}

TEST(ZPXLoader, FailuresStopTheLoad) {
    auto fail = [](const SceneFiles &f, const SceneLoadSettings &s = settings()) {
        Scene scene;
        LoadResult r = load(f.inputs, scene, s);
        EXPECT_FALSE(r.ok);
        return r;
    };
    // A mesh file that cannot be pre-opened.
    SceneFiles bad;
    test::writeBytes(bad.dir.file("bad.vtm"), {'V', 'T', 'M', 'X', 0});
    bad.inputs.push_back(bad.dir.file("bad.vtm"));
    LoadResult r = fail(bad);
    EXPECT_EQ(r.error, "Failed to preopen file " + bad.dir.file("bad.vtm"));
    EXPECT_NE(r.out.find("[ERROR]    Failed to preopen file "), std::string::npos);

    // A mesh file gone by the time its shape is built fails its work item, with the reason.
    {
        MaterialTable table;
        SceneMaterialResolver resolver(table);
        std::unique_ptr<Shape> slot;
        CreateTempShapeWork work(bad.dir.file("gone.vtm"), resolver, MeshBuildOptions(), slot);
        std::atomic<bool> stop{false};
        EXPECT_FALSE(work.run(stop, 0));
        EXPECT_EQ(work.errorText().rfind("Error reading " + bad.dir.file("gone.vtm"), 0), 0u)
            << work.errorText();
        EXPECT_EQ(slot, nullptr);
    }

    // An instance of a shape that no mesh file gives.
    SceneFiles ghost;
    ghost.xml("s.xml", instance("i", "ghost"));
    r = fail(ghost);
    EXPECT_EQ(r.error, "Missing shapes");
    EXPECT_NE(r.out.find("[WARNING]  Base shape ghost not found for instance i"),
              std::string::npos);
    EXPECT_NE(r.out.find("[ERROR]    Instance refering to non existing shape ghost"),
              std::string::npos);

    // A mesh whose material the scene does not define.
    SceneFiles undefined;
    undefined.quad("a.vtm", "s", "nope");
    undefined.xml("s.xml", material("m"));
    EXPECT_EQ(fail(undefined).error,
              "Error creating temp shapes: Material nope not defined when loading shape s");

    // A scene document with another root.
    SceneFiles other;
    other.inputs.push_back(other.dir.file("other.xml"));
    std::ofstream(other.inputs.back()) << "<Scene><Instance/></Scene>";
    EXPECT_NE(fail(other).error.find("has the root element \"Scene\" instead of OXScene"),
              std::string::npos);

    // An image-based environment whose image is missing.
    SceneLoadSettings s = settings();
    s.environment.rtEnvironment = 3;
    s.environment.iblImageFile = "/no/such/probe.hdr";
    SceneFiles empty;
    empty.xml("empty.xml", "");
    EXPECT_EQ(fail(empty, s).error, "Unable to create environment");
}

TEST(ZPXLoader, GobosProbesAndGeneratedLights) {
    SceneFiles f;
    // A 2 x 2 gobo, rows from the bottom: red, green, then blue, white.
    const std::string gobo = f.dir.file("gobo.tga"), bad = f.dir.file("bad.tga");
    const std::string probe = f.dir.file("probe.tga");
    ASSERT_TRUE(
        oxtest::writeTGA(gobo, 2, 2, {{255, 0, 0}, {0, 255, 0}, {0, 0, 255}, {255, 255, 255}}));
    ASSERT_TRUE(oxtest::writeTGA(probe, 8, 4, {32, {255, 255, 255}}));
    test::writeBytes(bad, {'n', 'o', 't'});
    const std::string spot =
        "<Color><r>1</r><g>1</g><b>1</b><a>1</a></Color>"
        "<SpotLightConeAngle>90</SpotLightConeAngle><SpotLightGoboTexture>";
    f.quad("a.vtm", "plane", "m");
    f.xml("s.xml", material("m") +
                       instance("linked", "plane",
                                "<LightLinkMode>INCLUSIVE</LightLinkMode><LightLinkedLights>"
                                "<element>SpecularSublight</element></LightLinkedLights>") +
                       instance("open", "plane") +
                       light("gobo", "SPOT", spot + gobo + "</SpotLightGoboTexture>") +
                       light("broken", "SPOT", spot + bad + "</SpotLightGoboTexture>") +
                       light("SpecularSublight", "POINT") + light("lamp", "POINT") +
                       light("lamp", "POINT"));
    SceneLoadSettings s = settings();
    s.environment.iblEmitLight = true;
    s.environment.iblEmitSpecular = true;
    s.environment.iblSamples = 4;
    s.environment.iblImageFile = probe;
    Scene scene;
    LoadResult r = load(f.inputs, scene, s);
    ASSERT_TRUE(r.ok) << r.error << r.out;
    EXPECT_EQ(test::countOf(r.out, "Gobo file " + bad + " failed to load"), 1) << r.out;
    EXPECT_EQ(test::countOf(r.out, "Duplicate light name"), 1) << r.out;  // the second lamp

    // The gobo over a cone of 45 degrees each side: u = 0.5 + x / 2, v = 0.5 + z / 2 one unit
    // below the light; near the cone's edge the edge texels, never the opposite side.
    auto *g = dynamic_cast<const SimpleSpotLight *>(scene.findLight("gobo"));
    ASSERT_TRUE(g && g->hasGobo());
    EXPECT_FALSE(dynamic_cast<const SimpleSpotLight *>(scene.findLight("broken"))->hasGobo());
    LightContext ctx;
    const struct {
        float x, z;
        Color want;
    } across[] = {{-0.5f, -0.5f, {1, 0, 0, 1}},     {0.5f, -0.5f, {0, 1, 0, 1}},
                  {-0.5f, 0.5f, {0, 0, 1, 1}},      {0.5f, 0.5f, {1, 1, 1, 1}},
                  {0.9f, 0.0f, {0.5f, 1, 0.5f, 1}}, {0.0f, -0.9f, {0.5f, 0.5f, 0, 1}}};
    for (const auto &a : across) {
        const Color c = g->illuminate({a.x, -1, a.z}, {0, 1, 0}, ctx, false);
        const float got[] = {c.r, c.g, c.b, c.a}, want[] = {a.want.r, a.want.g, a.want.b, a.want.a};
        for (int i = 0; i < 4; ++i) EXPECT_NEAR(got[i], want[i], 1e-5f) << a.x << " " << a.z;
    }

    // The image-based light and its four specular sub-lights, kept apart from the named lights:
    // the name still finds the scene's own light, and only that one is linkable by it.
    ASSERT_EQ(scene.lights().size(), 4u + 1u + 4u);
    EXPECT_STREQ(scene.lights()[4]->className(), "KDHDRLight");
    for (uint32_t l = 5; l < 9; ++l) {
        EXPECT_STREQ(scene.lights()[l]->className(), "KDSpecularSubLight");
        EXPECT_FALSE(scene.lightReaches(0, l));
        EXPECT_TRUE(scene.lightReaches(1, l));
    }
    EXPECT_EQ(scene.findLight("SpecularSublight"), scene.lights()[2].get());
    EXPECT_TRUE(scene.lightReaches(0, 2));
}

TEST(ZPXLoader, ShapesEdgeCases) {
    SceneFiles f;
    f.quad("a.vtm", "s", "m", {"map1", "lightmap"});
    f.quad("b.vtm", "s", "m");  // the same shape name again: the first wins
    MeshMaker empty("nothing", 0);
    empty.mesh.bounds = BBox(Vec3(0, 0, 0), Vec3(0, 0, 0));
    f.mesh("e.vtm", empty.mesh);
    // Six shapes with one UV layout, a seventh with another.
    for (int i = 0; i < 7; ++i)
        f.quad("v" + std::to_string(i) + ".vtm", "v" + std::to_string(i), "uvm",
               i < 6 ? std::vector<std::string>{"x", "lightmap"}
                     : std::vector<std::string>{"lightmap"});
    f.xml("s.xml", material("m") +
                       material("uvm",
                                "<Diffuse><UVLayerOverride>lightmap</UVLayerOverride>"
                                "<FileTexture>t.tga</FileTexture></Diffuse>") +
                       material("m", "<Shininess>99</Shininess>") + instance("i", "s"));
    Scene scene;
    LoadResult r = load(f.inputs, scene);
    ASSERT_TRUE(r.ok) << r.error << r.out;
    EXPECT_NE(r.out.find("[WARNING]  Duplicate shape name s, keeping the first one"),
              std::string::npos);
    EXPECT_NE(r.out.find("Empty mesh '" + f.dir.file("e.vtm") + "' added."), std::string::npos);
    EXPECT_EQ(scene.findShape("s")->vertices().uvSetCount(), 2u);
    EXPECT_EQ(scene.findShape("nothing"), nullptr);
    // The second "m" record does not replace the first; without UV overrides it is used as is.
    const Material *m = scene.materials().find("m");
    auto *phong = dynamic_cast<const PhongShader *>(&m->surface());
    ASSERT_TRUE(phong);
    EXPECT_EQ(phong->parameters().shininess, 1.0f);
    EXPECT_EQ(scene.findShape("s")->material(0), m);
    // Shapes built in parallel share one variant of "uvm" per UV layout.
    const Material *variant = materialOf(scene.findShape("v0")->material(0));
    EXPECT_EQ(variant->name(), "uvm|uv:1,-1,-1,-1,-1,-1,-1");
    EXPECT_EQ(variant->photon()->name(), "uvm|uv:1,-1,-1,-1,-1,-1,-1_photon");
    for (int i = 1; i < 6; ++i)
        EXPECT_EQ(scene.findShape("v" + std::to_string(i))->material(0), variant);
    EXPECT_EQ(materialOf(scene.findShape("v6")->material(0))->name(), "uvm|uv:0,-1,-1,-1,-1,-1,-1");
    EXPECT_EQ(scene.materials().size(), 4u);
}

}  // namespace
}  // namespace ox
