#include <ImfChannelList.h>
#include <ImfFrameBuffer.h>
#include <ImfHeader.h>
#include <ImfInputFile.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <filesystem>
#include <map>
#include <string>
#include <vector>

#include "scene/vtm.h"
#include "tests/support/test_support.h"

// Light maps baked by the program itself, checked against closed forms: a plane under a point
// light and under a directional light, the passes' product, seams between charts, and the
// failures of a bake.
namespace {

struct Image {
    int w = 0, h = 0;
    std::map<std::string, std::vector<float>> channels;
    /// Channel c at texel (x, y), row 0 at the bottom (files store the top row first).
    float at(const std::string &c, int x, int y) const {
        return channels.at(c)[size_t(h - 1 - y) * size_t(w) + size_t(x)];
    }
};

Image readExr(const std::string &path) {
    Image img;
    Imf::InputFile in(path.c_str());
    const auto dw = in.header().dataWindow();
    img.w = dw.max.x - dw.min.x + 1;
    img.h = dw.max.y - dw.min.y + 1;
    Imf::FrameBuffer fb;
    for (auto it = in.header().channels().begin(); it != in.header().channels().end(); ++it) {
        std::vector<float> &v = img.channels[it.name()];
        v.assign(size_t(img.w) * size_t(img.h), -99.0f);
        fb.insert(it.name(), Imf::Slice(Imf::FLOAT, reinterpret_cast<char *>(v.data()),
                                        sizeof(float), sizeof(float) * size_t(img.w)));
    }
    in.setFrameBuffer(fb);
    in.readPixels(dw.min.y, dw.max.y);
    return img;
}

/// One chart: a quad with corners p[0..3] (counter-clockwise around normal n) laid onto the
/// UVs uv[0..3].
struct Quad {
    std::array<ox::Vec3, 4> p;
    ox::Vec3 n;
    std::array<ox::Vec2, 4> uv;
};

/// A quad of the plane z = 0 ([x0, x1] x [y0, y1]) laid onto the UV rectangle [u0, u1] x
/// [v0, v1].
Quad planeQuad(float x0, float y0, float x1, float y1, float u0, float v0, float u1, float v1) {
    return {{{{x0, y0, 0}, {x1, y0, 0}, {x1, y1, 0}, {x0, y1, 0}}},
            {0, 0, 1},
            {{{u0, v0}, {u1, v0}, {u1, v1}, {u0, v1}}}};
}

/// Writes a mesh file of quads with UV set "lightmap", all of one material.
void writeMesh(const std::string &path, const std::string &name, const std::vector<Quad> &quads,
               const std::string &material) {
    vtm::TempMesh m;
    m.name = name;
    m.uvSetNames = {"lightmap"};
    for (const Quad &q : quads) {
        const uint32_t base = m.vertexCount();
        const ox::Vec3 t = (q.p[1] - q.p[0]).normalized(), b = ox::cross(q.n, t);
        for (int k = 0; k < 4; ++k) {
            const float rec[12] = {q.p[k].x, q.p[k].y, q.p[k].z, q.n.x, q.n.y, q.n.z,
                                   t.x,      t.y,      t.z,      b.x,   b.y,   b.z};
            m.vertices.insert(m.vertices.end(), rec, rec + 12);
            m.uvs.push_back(q.uv[k].x);
            m.uvs.push_back(q.uv[k].y);
            m.bounds.extend(q.p[k]);
        }
        for (uint32_t i : {0u, 1u, 2u, 0u, 2u, 3u}) m.indices.push_back(base + i);
    }
    m.groups.push_back({material, uint32_t(quads.size() * 2)});
    std::string error;
    ASSERT_TRUE(vtm::writeTempMesh(path, m, 2, &error)) << error;
}

std::string sceneXml(const std::string &light, const std::string &instances) {
    return "<?xml version=\"1.0\" encoding=\"ISO-8859-1\"?>\n<OXScene>"
           "<Material><Name>paint</Name><Diffuse><Color><r>0.8</r><g>0.5</g><b>0.25</b>"
           "<a>1</a></Color><Scale>1</Scale></Diffuse></Material>" +
           light + instances + "</OXScene>\n";
}

std::string instanceXml(const std::string &name) {
    return "<Instance><Name>" + name + "</Name><Shape>" + name + "</Shape></Instance>";
}

/// A white point light at (x, y, z) with (1 / d)^2 falloff.
std::string pointLight(float x, float y, float z) {
    return "<LightSource><Name>lamp</Name><Type>POINT</Type><Color><r>1</r><g>1</g><b>1</b>"
           "<a>1</a></Color><FalloffExponent>2</FalloffExponent><DecayClampToOne>false"
           "</DecayClampToOne><AttenuationType>STANDARD</AttenuationType>" +
           oxtest::translationXml(x, y, z) + "</LightSource>";
}

/// A directional light whose light arrives from the direction `towards` (unit).
std::string sunLight(float tx, float ty, float tz) {
    // The light shines along its local -y: local y is the direction towards the light.
    const float ax = std::fabs(tx) < 0.9f ? 1.0f : 0.0f, ay = 1.0f - ax;
    float xx = ay * tz - 0 * ty, xy = 0 * tx - ax * tz, xz = ax * ty - ay * tx;
    const float l = std::sqrt(xx * xx + xy * xy + xz * xz);
    xx /= l, xy /= l, xz /= l;
    const float zx = xy * tz - xz * ty, zy = xz * tx - xx * tz, zz = xx * ty - xy * tx;
    const float m[4][4] = {{xx, xy, xz, 0}, {tx, ty, tz, 0}, {zx, zy, zz, 0}, {0, 0, 0, 1}};
    return "<LightSource><Name>sun</Name><Type>DIRECTIONAL</Type><Color><r>1</r><g>1</g>"
           "<b>1</b><a>1</a></Color>" +
           oxtest::objectToWorldXml(m) + "</LightSource>";
}

struct Target {
    std::string name;
    std::vector<std::string> surfaces;
    int size = 64;
};

std::string configXml(const std::vector<Target> &targets, const std::string &bakeExtra,
                      const std::string &components) {
    std::string t;
    for (const Target &g : targets) {
        t += "<element><textureName>" + g.name +
             "</textureName><hasResolutionOverride>true</hasResolutionOverride>"
             "<resolutionOverride><x>" +
             std::to_string(g.size) + "</x><y>" + std::to_string(g.size) +
             "</y></resolutionOverride><targetSurfaces>";
        for (const std::string &s : g.surfaces)
            t += "<element><target>" + s + "</target></element>";
        t += "</targetSurfaces></element>";
    }
    return "<?xml version=\"1.0\" encoding=\"ISO-8859-1\"?>\n<OXConfig><FrameSettings>"
           "<renderType>TextureBake</renderType></FrameSettings><TextureBakeSettings>"
           "<uvSet>lightmap</uvSet>" +
           bakeExtra + "<RenderComponents>" + components + "</RenderComponents><targets>" + t +
           "</targets></TextureBakeSettings></OXConfig>\n";
}

using oxtest::countOf;
using oxtest::writeFile;

// The plane [-1, 1]^2 laid onto UVs [0.125, 0.875]^2 of a 64 x 64 target: 48 x 48 texels
// covered, the rest background.
const Quad kPlane = planeQuad(-1, -1, 1, 1, 0.125f, 0.125f, 0.875f, 0.875f);

/// The surface point of texel (x, y) of kPlane's target; false for background.
bool planePoint(int x, int y, float &px, float &py) {
    const float u = (x + 0.5f) / 64.0f, v = (y + 0.5f) / 64.0f;
    px = (u - 0.125f) / 0.75f * 2.0f - 1.0f;
    py = (v - 0.125f) / 0.75f * 2.0f - 1.0f;
    return std::fabs(px) <= 1.0f && std::fabs(py) <= 1.0f;
}

class TextureBakeTest : public oxtest::TempDirTest {
protected:
    TextureBakeTest() : TempDirTest("ox_bake_") {}
    /// kPlane under a point light one unit above its centre.
    void planeUnderLamp() {
        writeMesh("plane.vtm", "plane", {kPlane}, "paint");
        writeFile("scene.xml", sceneXml(pointLight(0, 0, 1), instanceXml("plane")));
    }
    oxtest::RunResult bake(const std::string &args) {
        return oxtest::runProgram(OX_BINARY_DIR "/app/thevorn",
                                  "scene.xml plane.vtm -x bake.xml -b -q " + args);
    }
};

TEST_F(TextureBakeTest, PointLightOverAPlaneFollowsTheInverseSquareCosineLaw) {
    const float h = 1.0f;
    planeUnderLamp();
    writeFile("bake.xml",
              configXml({{"plane", {"plane"}}},
                        "<edgeDilation>0</edgeDilation><bilinearFilter>false</bilinearFilter>",
                        "<illumination>true</illumination><albedo>true</albedo>"
                        "<fullShading>true</fullShading>"));
    const oxtest::RunResult r = bake("-me -o lm");
    ASSERT_EQ(r.status, 0) << r.output;
    // One file for the target holding every pass.
    ASSERT_TRUE(std::filesystem::exists("lm_plane.exr")) << r.output;
    int files = 0;
    for (const auto &e : std::filesystem::directory_iterator(".")) files += e.is_regular_file();
    EXPECT_EQ(files, 4);  // scene, mesh, configuration and the light map
    const Image img = readExr("lm_plane.exr");
    ASSERT_EQ(img.w, 64);
    int covered = 0;
    for (int y = 0; y < 64; ++y)
        for (int x = 0; x < 64; ++x) {
            float px, py;
            const bool on = planePoint(x, y, px, py);
            ASSERT_EQ(img.at("Z", x, y) >= 0.0f, on) << x << "," << y;
            if (!on) {
                EXPECT_EQ(img.at("Z", x, y), -1.0f);
                EXPECT_EQ(img.at("tpIllumination.R", x, y), 0.0f);
                continue;
            }
            ++covered;
            const float expected = h / std::pow(h * h + px * px + py * py, 1.5f);
            for (const char *c : {"tpIllumination.R", "tpIllumination.G", "tpIllumination.B"})
                ASSERT_NEAR(img.at(c, x, y), expected, expected * 1e-3f)
                    << c << " " << x << "," << y;
            // Beauty of a diffuse material: albedo times the light arriving.
            const float albedo[3] = {0.8f, 0.5f, 0.25f};
            const char *ch[3] = {"R", "G", "B"};
            for (int k = 0; k < 3; ++k) {
                EXPECT_NEAR(img.at(std::string("tpAlbedo.") + ch[k], x, y), albedo[k], 1e-5f);
                const float product = img.at(std::string("tpAlbedo.") + ch[k], x, y) *
                                      img.at(std::string("tpIllumination.") + ch[k], x, y);
                EXPECT_NEAR(img.at(std::string("beauty.") + ch[k], x, y), product,
                            product * 1e-3f + 1e-6f);
            }
        }
    EXPECT_EQ(covered, 48 * 48);
}

TEST_F(TextureBakeTest, DirectionalLightAtSixtyDegreesGivesOneHalf) {
    writeMesh("plane.vtm", "plane", {kPlane}, "paint");
    const float s = std::sqrt(3.0f) / 2.0f;
    writeFile("scene.xml", sceneXml(sunLight(s, 0.0f, 0.5f), instanceXml("plane")));
    writeFile("bake.xml",
              configXml({{"plane", {"plane"}}}, "<bilinearFilter>false</bilinearFilter>",
                        "<illumination>true</illumination>"));
    const oxtest::RunResult r = bake("-e -o lm");
    ASSERT_EQ(r.status, 0) << r.output;
    const Image img = readExr("lm_plane_tpIllumination.exr");
    for (int y = 0; y < 64; ++y)
        for (int x = 0; x < 64; ++x) {
            float px, py;
            if (!planePoint(x, y, px, py)) continue;
            ASSERT_NEAR(img.at("R", x, y), 0.5f, 0.5e-3f) << x << "," << y;
        }
    // Edge dilation (5 + 1 texels) fills the ring around the chart with its neighbours.
    EXPECT_NEAR(img.at("R", 8 - 6, 30), 0.5f, 0.5e-3f);
    EXPECT_EQ(img.at("R", 8 - 7, 30), 0.0f);
}

/// The six faces of the cube [-1, 1]^3 as charts of a 3 x 2 atlas; face k spans
/// [u0(k), u0(k) + size] x [v0(k), v0(k) + size].
constexpr float kFaceSize = 0.29f;
float faceU0(int k) { return 0.02f + 0.33f * float(k % 3); }
float faceV0(int k) { return 0.1f + 0.5f * float(k / 3); }
std::vector<Quad> cubeFaces() {
    using ox::Vec3;
    // Normal, then two axes a, b with a x b = normal.
    const Vec3 faces[6][3] = {
        {{1, 0, 0}, {0, 1, 0}, {0, 0, 1}},  {{0, 1, 0}, {0, 0, 1}, {1, 0, 0}},
        {{0, 0, 1}, {1, 0, 0}, {0, 1, 0}},  {{-1, 0, 0}, {0, 0, 1}, {0, 1, 0}},
        {{0, -1, 0}, {1, 0, 0}, {0, 0, 1}}, {{0, 0, -1}, {0, 1, 0}, {1, 0, 0}}};
    std::vector<Quad> quads;
    for (int k = 0; k < 6; ++k) {
        const Vec3 n = faces[k][0], a = faces[k][1], b = faces[k][2];
        Quad q;
        q.n = n;
        const float st[4][2] = {{-1, -1}, {1, -1}, {1, 1}, {-1, 1}};
        for (int c = 0; c < 4; ++c) {
            q.p[c] = n + a * st[c][0] + b * st[c][1];
            q.uv[c] = {faceU0(k) + (st[c][0] + 1) * 0.5f * kFaceSize,
                       faceV0(k) + (st[c][1] + 1) * 0.5f * kFaceSize};
        }
        quads.push_back(q);
    }
    return quads;
}

/// A bilinear lookup of channel c at UV (u, v), texel centres at (i + 0.5) / size.
float bilinear(const Image &img, const std::string &c, float u, float v) {
    const float fx = u * float(img.w) - 0.5f, fy = v * float(img.h) - 0.5f;
    const int x0 = int(std::floor(fx)), y0 = int(std::floor(fy));
    const float tx = fx - float(x0), ty = fy - float(y0);
    float sum = 0.0f;
    for (int dy = 0; dy < 2; ++dy)
        for (int dx = 0; dx < 2; ++dx) {
            const int x = std::clamp(x0 + dx, 0, img.w - 1), y = std::clamp(y0 + dy, 0, img.h - 1);
            sum += img.at(c, x, y) * (dx ? tx : 1 - tx) * (dy ? ty : 1 - ty);
        }
    return sum;
}

TEST_F(TextureBakeTest, SeamsOfACubeAgreeUnderBilinearLookups) {
    // A light on the diagonal between the +x and +y faces lights their shared edge alike from
    // both sides: cos = 2 / d on either face.
    writeMesh("plane.vtm", "plane", cubeFaces(), "paint");
    writeFile("scene.xml", sceneXml(pointLight(3, 3, 0), instanceXml("plane")));
    writeFile("bake.xml", configXml({{"cube", {"plane"}, 128}}, "<edgeDilation>2</edgeDilation>",
                                    "<illumination>true</illumination>"));
    const oxtest::RunResult r = bake("-e -o lm");
    ASSERT_EQ(r.status, 0) << r.output;
    const Image img = readExr("lm_cube_tpIllumination.exr");
    // Along the edge x = y = 1: on the +x face (k 0) it is the chart's right border (u end,
    // v from z); on the +y face (k 1) its top border (v end, u from z).
    for (int i = 0; i <= 40; ++i) {
        const float z = -0.95f + 1.9f * float(i) / 40.0f;
        const float d = std::sqrt(8.0f + z * z);
        const float truth = 2.0f / (d * d * d);
        const float a =
            bilinear(img, "R", faceU0(0) + kFaceSize, faceV0(0) + (z + 1) * 0.5f * kFaceSize);
        const float b =
            bilinear(img, "R", faceU0(1) + (z + 1) * 0.5f * kFaceSize, faceV0(1) + kFaceSize);
        EXPECT_NEAR(a, b, 0.02f * truth) << "z " << z;
        EXPECT_NEAR(a, truth, 0.02f * truth) << "z " << z;
        EXPECT_NEAR(b, truth, 0.02f * truth) << "z " << z;
    }
}

TEST_F(TextureBakeTest, BadTargetsFailBeforeAnythingIsBaked) {
    planeUnderLamp();
    struct Case {
        std::vector<Target> targets;
        std::string components;
        int status;
        std::string text;
    };
    const Case cases[] = {
        {{{"plane", {"plane"}, 0}},
         "<illumination>true</illumination>",
         8,
         "BakeTextureTarget 'plane' with invalid dimension 0x0."},
        {{{"default", {"plane"}}, {"default", {"plane"}}},
         "<illumination>true</illumination>",
         8,
         "BakeTextureTarget 1 and 2 are both named 'default'"},
        {{{"plane", {"plane"}}}, "", 10, "No valid RenderComponents found in TextureBakeSettings!"},
        {{}, "<illumination>true</illumination>", 1, "No targets specified, aborting baking"},
        {{{"plane", {"nothing"}}},
         "<illumination>true</illumination>",
         1,
         "No shapes to bake, aborting baking"},
    };
    for (const Case &c : cases) {
        writeFile("bake.xml", configXml(c.targets, "", c.components));
        const oxtest::RunResult r = bake("-e -o lm");
        EXPECT_EQ(r.status, c.status) << r.output;
        EXPECT_NE(r.output.find(c.text), std::string::npos) << r.output;
        for (const auto &e : std::filesystem::directory_iterator("."))
            EXPECT_EQ(e.path().extension(), e.is_regular_file() ? e.path().extension() : "")
                << e.path();
        EXPECT_FALSE(std::filesystem::exists("lm_plane_tpIllumination.exr"));
        EXPECT_FALSE(std::filesystem::exists("lm_default_tpIllumination.exr"));
    }
}

TEST_F(TextureBakeTest, PassesOuterTargetsInnerAndSkippedShapes) {
    // Two planes; the second target also names a missing instance and one of zero UV scale,
    // which are skipped while its good shape still bakes.
    writeMesh("plane.vtm", "plane", {kPlane}, "paint");
    writeMesh("other.vtm", "other", {planeQuad(2, -1, 4, 1, 0.125f, 0.125f, 0.875f, 0.875f)},
              "paint");
    writeFile("scene.xml",
              sceneXml(pointLight(0, 0, 1), instanceXml("plane") + instanceXml("other")));
    std::string config = configXml(
        {{"a", {"plane"}, 16}, {"b", {"missing", "other", "plane"}, 16}, {"c", {"plane"}, 16}}, "",
        "<albedo>true</albedo><fullShading>true</fullShading>");
    // The third shape of target b gets a zero UV scale.
    const std::string third = "<element><target>plane</target></element></targetSurfaces>";
    const size_t at = config.find(third, config.find("<textureName>b<"));
    config.replace(at, third.size(),
                   "<element><target>plane</target><UVScale><x>0</x><y>1</y></UVScale></element>"
                   "</targetSurfaces>");
    writeFile("bake.xml", config);
    const oxtest::RunResult r = oxtest::runProgram(
        OX_BINARY_DIR "/app/thevorn", "scene.xml plane.vtm other.vtm -x bake.xml -b -q -t -o lm");
    ASSERT_EQ(r.status, 0) << r.output;
    // The step order itself is the driver's (see its tests); here all six steps ran.
    EXPECT_NE(r.output.find("[6/6] Rendering c [Target 3/3] [Pass 2/2]"), std::string::npos)
        << r.output;
    // Shapes are resolved once per target, not once per pass; the skipped shapes' messages
    // are the bake's own (see its tests).
    EXPECT_EQ(countOf(r.output, "Instance missing not found"), 1);
    for (const char *f : {"lm_a_tpAlbedo.tga", "lm_b_tpAlbedo.tga", "lm_c_tpAlbedo.tga",
                          "lm_a_beauty.tga", "lm_b_beauty.tga", "lm_c_beauty.tga"})
        EXPECT_TRUE(std::filesystem::exists(f)) << f;
}

TEST_F(TextureBakeTest, OverlappingChartsAreReportedOncePerTarget) {
    // Two quads over the same UV square: every covered texel overlaps.
    writeMesh("plane.vtm", "plane",
              {planeQuad(-1, -1, 1, 1, 0, 0, 0.5f, 0.5f), planeQuad(2, -1, 4, 1, 0, 0, 0.5f, 0.5f)},
              "paint");
    writeFile("scene.xml", sceneXml(pointLight(0, 0, 1), instanceXml("plane")));
    writeFile("bake.xml", configXml({{"plane", {"plane"}, 16}}, "",
                                    "<illumination>true</illumination><albedo>true</albedo>"));
    const oxtest::RunResult r = bake("-e -o lm");
    ASSERT_EQ(r.status, 0) << r.output;
    // Centres on the quads' diagonals lie on shared edges, which alone are no overlap.
    EXPECT_EQ(countOf(r.output, "overlapping UV triangles"), 1) << r.output;
    EXPECT_NE(r.output.find("Target plane: 56 of 64 covered texels lie under overlapping UV"),
              std::string::npos)
        << r.output;
}

TEST_F(TextureBakeTest, CameraSideWithoutACameraUsesTheSceneCentre) {
    planeUnderLamp();
    writeFile("bake.xml",
              configXml({{"plane", {"plane"}, 16}}, "<normalDirection>Camera</normalDirection>",
                        "<illumination>true</illumination>"));
    const oxtest::RunResult r = bake("-e -o lm");
    ASSERT_EQ(r.status, 0) << r.output;
    EXPECT_NE(r.output.find("The scene has no camera persp: baking views the surfaces from the "
                            "centre of the scene box (0, 0, 0)."),
              std::string::npos)
        << r.output;
}

TEST_F(TextureBakeTest, UnwritableOutputFailsWithoutPartialFiles) {
    planeUnderLamp();
    writeFile("bake.xml",
              configXml({{"plane", {"plane"}, 16}}, "", "<illumination>true</illumination>"));
    // A directory where the light map would go: the finished file cannot take its name.
    std::filesystem::create_directory("lm_plane.exr");
    oxtest::RunResult r = bake("-me -o lm");
    EXPECT_EQ(r.status, 12) << r.output;  // 0x2000000C
    for (const auto &e : std::filesystem::directory_iterator("."))
        EXPECT_TRUE(e.is_directory() || e.path().extension() == ".xml" ||
                    e.path().extension() == ".vtm")
            << e.path();
    std::filesystem::remove("lm_plane.exr");

    // An output directory the program may not write to (run as an ordinary user when the
    // tests run as root, who may write anywhere).
    std::filesystem::create_directories("ro");
    r = bake("-e -od ro -o lm");  // creates the directories the run needs
    ASSERT_EQ(r.status, 0) << r.output;
    std::filesystem::remove("ro/lm_plane_tpIllumination.exr");
    ::chmod("ro", 0555);
    const bool root = ::geteuid() == 0;
    if (root && !std::filesystem::exists("/usr/bin/setpriv")) GTEST_SKIP() << "no setpriv";
    ::chmod(".", 0755);
    const std::string prefix =
        root ? "/usr/bin/setpriv --reuid=65534 --regid=65534 --clear-groups " : "";
    r = oxtest::runProgram(prefix + OX_BINARY_DIR "/app/thevorn",
                           "scene.xml plane.vtm -x bake.xml -b -q -e -od ro -o lm");
    ::chmod("ro", 0755);
    EXPECT_EQ(r.status, 12) << r.output;
    int files = 0;
    for (const auto &e : std::filesystem::directory_iterator("ro")) files += e.is_regular_file();
    EXPECT_EQ(files, 0);
}

TEST_F(TextureBakeTest, SameBytesOnAnyThreadCount) {
    // Soft shadows of an area light over a plane with a blocker: random shadow samples, the
    // adaptive edge samples and the filters all take part.
    writeMesh("plane.vtm", "plane", {kPlane}, "paint");
    writeMesh(
        "blocker.vtm", "blocker",
        {Quad{
            {{{-0.3f, -0.3f, 0.5f}, {0.3f, -0.3f, 0.5f}, {0.3f, 0.3f, 0.5f}, {-0.3f, 0.3f, 0.5f}}},
            {0, 0, 1},
            {{{0, 0}, {1, 0}, {1, 1}, {0, 1}}}}},
        "paint");
    const float m[4][4] = {{0.3f, 0, 0, 0}, {0, -0.3f, 0, 0}, {0, 0, -1, 0}, {0, 0, 1.5f, 1}};
    writeFile("scene.xml",
              sceneXml("<LightSource><Name>panel</Name><Type>AREA</Type><Color><r>4</r><g>4</g>"
                       "<b>4</b><a>1</a></Color><CastShadows>true</CastShadows><ShadowSamples>8"
                       "</ShadowSamples><FalloffExponent>2</FalloffExponent>" +
                           oxtest::objectToWorldXml(m) + "</LightSource>",
                       instanceXml("plane") + instanceXml("blocker")));
    std::string config =
        configXml({{"plane", {"plane"}, 64}}, "<shadows>true</shadows>",
                  "<illumination>true</illumination><fullShading>true</fullShading>");
    config.replace(config.find("<FrameSettings>"), 15,
                   "<AASettings><maxSampleRate>2</maxSampleRate></AASettings><FrameSettings>");
    writeFile("bake.xml", config);
    std::string first;
    for (const char *threads : {"1", "2", "3"}) {
        const oxtest::RunResult r =
            oxtest::runProgram(OX_BINARY_DIR "/app/thevorn",
                               std::string("scene.xml plane.vtm blocker.vtm -x bake.xml -b -q "
                                           "-me -o lm -rt ") +
                                   threads);
        ASSERT_EQ(r.status, 0) << r.output;
        const std::string bytes = oxtest::readFile("lm_plane.exr");
        if (first.empty()) first = bytes;
        EXPECT_TRUE(bytes == first) << threads << " threads";
    }
    // The shadow is there: the texel under the blocker is darker than one far from it.
    const Image img = readExr("lm_plane.exr");
    EXPECT_LT(img.at("tpIllumination.R", 32, 32), 0.5f * img.at("tpIllumination.R", 10, 10));
}

TEST_F(TextureBakeTest, NormalizedBakeWritesItsRangeAndStaysContinuousAtChartEdges) {
    planeUnderLamp();
    writeFile("bake.xml",
              configXml({{"plane", {"plane"}}},
                        "<Normalize><normalizeValues>true</normalizeValues></Normalize>",
                        "<illumination>true</illumination>"));
    const oxtest::RunResult r = bake("-e -o lm");
    ASSERT_EQ(r.status, 0) << r.output;
    const std::string xml = oxtest::readFile("lm_plane_tpIllumination.xml");
    EXPECT_NE(xml.find("MinMaxRoot"), std::string::npos) << xml;
    EXPECT_NE(xml.find("plane"), std::string::npos) << xml;
    // Max mode: [0, max] -> [0, 1]; the brightest texel is the one under the light.
    const Image img = readExr("lm_plane_tpIllumination.exr");
    float top = 0.0f;
    for (int y = 8; y < 56; ++y)
        for (int x = 8; x < 56; ++x) top = std::max(top, img.at("R", x, y));
    EXPECT_NEAR(top, 1.0f, 1e-6f);
    // The bilinear filter's texels beyond the chart follow the normalized surface: the ring
    // just outside continues the falloff inside instead of jumping to the raw values.
    for (int y = 10; y < 54; y += 4) {
        const float in1 = img.at("R", 8, y), in2 = img.at("R", 9, y), out1 = img.at("R", 7, y);
        EXPECT_NEAR(out1, in1 - (in2 - in1), 0.01f) << y;
    }
}

TEST_F(TextureBakeTest, RadiosityNormalMapsWriteOneFilePerBasisLayer) {
    planeUnderLamp();
    for (const bool mono : {false, true}) {
        for (int k = 0; k < 4; ++k)
            std::filesystem::remove("lm_plane_tpRnm" + std::to_string(k) + ".exr");
        writeFile("bake.xml",
                  configXml({{"plane", {"plane"}, 16}}, "",
                            std::string("<rnm>true</rnm><RNMSettings><monochrome>") +
                                (mono ? "true" : "false") + "</monochrome></RNMSettings>"));
        const oxtest::RunResult r = bake("-e -o lm");
        ASSERT_EQ(r.status, 0) << r.output;
        EXPECT_TRUE(std::filesystem::exists("lm_plane_tpRnm0.exr"));
        EXPECT_TRUE(std::filesystem::exists("lm_plane_tpRnm1.exr"));
        EXPECT_EQ(std::filesystem::exists("lm_plane_tpRnm2.exr"), !mono);
    }
}
}  // namespace
