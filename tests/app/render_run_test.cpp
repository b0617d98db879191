// Camera renders through the built program: the pixels a triangle covers, a plane lit by a
// point light against its closed form, the camera fall-back, and the files a render leaves.
#include <ImfChannelList.h>
#include <ImfFrameBuffer.h>
#include <ImfHeader.h>
#include <ImfInputFile.h>
#include <gtest/gtest.h>

#include <cmath>
#include <filesystem>
#include <fstream>

#include "scene/vtm.h"
#include "tests/support/test_support.h"

namespace fs = std::filesystem;

namespace {

/// The layers of a multi-layer EXR: row 0 is the bottom row, as in the frame.
struct Layers {
    int w = 0, h = 0;
    std::vector<float> r, a, z;
    size_t at(int x, int y) const { return size_t(y) * size_t(w) + size_t(x); }
};

bool readLayers(const std::string &file, Layers &out) {
    try {
        Imf::InputFile in(file.c_str());
        const Imath::Box2i dw = in.header().dataWindow();
        out.w = dw.max.x - dw.min.x + 1;
        out.h = dw.max.y - dw.min.y + 1;
        const size_t n = size_t(out.w) * size_t(out.h);
        std::vector<float> r(n), a(n), z(n);
        Imf::FrameBuffer fb;
        const size_t xs = sizeof(float), ys = sizeof(float) * size_t(out.w);
        auto slice = [&](std::vector<float> &v) {
            return Imf::Slice(Imf::FLOAT,
                              reinterpret_cast<char *>(v.data()) - dw.min.x * xs - dw.min.y * ys,
                              xs, ys);
        };
        fb.insert("beauty.R", slice(r));
        fb.insert("beauty.A", slice(a));
        fb.insert("Z", slice(z));
        in.setFrameBuffer(fb);
        in.readPixels(dw.min.y, dw.max.y);
        // The file's first line is the top row.
        out.r.resize(n), out.a.resize(n), out.z.resize(n);
        for (int y = 0; y < out.h; ++y)
            for (int x = 0; x < out.w; ++x) {
                const size_t from = size_t(out.h - 1 - y) * size_t(out.w) + size_t(x);
                out.r[out.at(x, y)] = r[from];
                out.a[out.at(x, y)] = a[from];
                out.z[out.at(x, y)] = z[from];
            }
        return true;
    } catch (const std::exception &e) {
        ADD_FAILURE() << file << ": " << e.what();
        return false;
    }
}

class RenderRun : public oxtest::TempDirTest {
protected:
    RenderRun() : TempDirTest("ox_render_run_test_") {}

    /// A mesh file of one shape with triangles (three corners each) of material "white".
    void mesh(const std::string &file, const std::string &shape, const std::vector<ox::Vec3> &p) {
        vtm::TempMesh m;
        m.name = shape;
        m.uvSetNames = {"map1"};
        for (const ox::Vec3 &v : p) {
            const float rec[12] = {v.x, v.y, v.z, 0, 0, 1, 1, 0, 0, 0, 1, 0};
            m.vertices.insert(m.vertices.end(), rec, rec + 12);
            m.uvs.push_back(v.x);
            m.uvs.push_back(v.y);
            m.bounds.extend(v);
        }
        for (uint32_t i = 0; i < p.size(); ++i) m.indices.push_back(i);
        m.groups.push_back({"white", uint32_t(p.size() / 3)});
        ASSERT_TRUE(vtm::writeTempMesh(file, m, 2));
        inputs.push_back(file);
    }
    void scene(const std::string &body) {
        std::ofstream("scene.xml")
            << "<?xml version=\"1.0\"?>\n<OXScene>\n"
               "<Material><Name>white</Name><Diffuse><Color><r>1</r><g>1</g><b>1</b><a>1</a>"
               "</Color><Scale>1</Scale></Diffuse></Material>\n"
               "<Instance><Name>thing</Name><Shape>thing</Shape></Instance>\n"
            << body << "</OXScene>\n";
        inputs.insert(inputs.begin(), "scene.xml");
    }
    /// A configuration of an 8 x 8 render with one sample per pixel centre and a box filter.
    void config(const std::string &camera, const std::string &frame = "") {
        std::ofstream("render.xml")
            << "<?xml version=\"1.0\"?>\n<OXConfig><FrameSettings><resolution><x>8</x><y>8</y>"
               "</resolution>"
            << (camera.empty() ? "" : "<cameraName>" + camera + "</cameraName>") << frame
            << "</FrameSettings><AASettings><samplingMode>SuperSampling</samplingMode>"
               "<minSampleRate>0</minSampleRate><maxSampleRate>0</maxSampleRate>"
               "<edgeTracing>false</edgeTracing><filter>Box</filter></AASettings></OXConfig>\n";
    }
    oxtest::RunResult run(const std::vector<std::string> &extra) {
        std::string line;
        for (const auto &a : inputs) line += " '" + a + "'";
        for (const auto &a : extra) line += " '" + a + "'";
        return oxtest::runProgram(OX_BINARY_DIR "/app/thevorn", line);
    }
    std::vector<std::string> inputs;
};

/// A perspective camera five units above the origin, looking down -z.
const std::string kCamera = "<Camera><Name>cam</Name><Fov><x>0.8</x><y>0.8</y></Fov>" +
                            oxtest::translationXml(0, 0, 5) + "</Camera>\n";
/// An orthographic camera over the square [-4, 4]^2, five units above it.
const std::string kTopCamera =
    "<Camera><Name>top</Name><Type>ORTHO</Type><ImagePlaneSize><x>8</x><y>8</y>"
    "</ImagePlaneSize>" +
    oxtest::translationXml(0, 0, 5) + "</Camera>\n";

TEST_F(RenderRun, TriangleCoversThePixelsItsProjectionCovers) {
    const ox::Vec3 tri[3] = {{-1.0f, -1.1f, 0.0f}, {1.6f, -0.4f, 0.0f}, {-0.3f, 1.25f, 0.0f}};
    mesh("thing.vtm", "thing", {tri[0], tri[1], tri[2]});
    scene(kCamera);
    config("cam");
    const auto r = run({"-x", "render.xml", "-r", "-me", "-q", "-o", "render"});
    ASSERT_EQ(r.status, 0) << r.output;
    EXPECT_NE(r.output.find("[INFO]     [1/1] Rendering cam [Target 1/1] [Pass 1/1]"),
              std::string::npos);
    EXPECT_NE(r.output.find("[PROGRESS] Done rendering! Total render time: "), std::string::npos);
    Layers img;
    ASSERT_TRUE(readLayers("render_cam.exr", img));
    ASSERT_EQ(img.w, 8);
    // The pinhole ray through each pixel centre meets z = 0 at 5 * (H (x - 1/2) + V (y - 1/2)).
    const double span = 2.0 * std::tan(0.4);
    int covered = 0;
    for (int y = 0; y < 8; ++y)
        for (int x = 0; x < 8; ++x) {
            const double px = 5.0 * span * ((x + 0.5) / 8.0 - 0.5);
            const double py = 5.0 * span * ((y + 0.5) / 8.0 - 0.5);
            auto side = [&](const ox::Vec3 &a, const ox::Vec3 &b) {
                return (double(b.x) - a.x) * (py - a.y) - (double(b.y) - a.y) * (px - a.x);
            };
            const double s0 = side(tri[0], tri[1]), s1 = side(tri[1], tri[2]),
                         s2 = side(tri[2], tri[0]);
            ASSERT_GT(std::min({std::fabs(s0), std::fabs(s1), std::fabs(s2)}), 1e-3);
            const bool inside = s0 > 0 && s1 > 0 && s2 > 0;
            covered += inside;
            EXPECT_EQ(img.a[img.at(x, y)], inside ? 1.0f : 0.0f) << x << "," << y;
            // Depth: the distance along the unit ray from the camera.
            const double distance = std::sqrt(px * px + py * py + 25.0);
            EXPECT_NEAR(img.z[img.at(x, y)], inside ? distance : -1.0, 1e-4) << x << "," << y;
        }
    EXPECT_GT(covered, 8);
    EXPECT_LT(covered, 40);
}

TEST_F(RenderRun, PlaneUnderAPointLightFollowsTheInverseSquareCosineLaw) {
    mesh("thing.vtm", "thing",
         {{-10, -10, 0}, {10, -10, 0}, {10, 10, 0}, {-10, -10, 0}, {10, 10, 0}, {-10, 10, 0}});
    scene(kTopCamera +
          "<LightSource><Name>bulb</Name><Type>POINT</Type><Color><r>1</r><g>1</g><b>1</b><a>1</a>"
          "</Color><FalloffExponent>2</FalloffExponent><DecayClampToOne>false</DecayClampToOne>"
          "<CastShadows>false</CastShadows>" +
          oxtest::translationXml(0, 0, 2) + "</LightSource>\n");
    config("top");
    const auto r = run({"-x", "render.xml", "-r", "-me", "-q", "-o", "plane", "-rt", "2"});
    ASSERT_EQ(r.status, 0) << r.output;
    Layers img;
    ASSERT_TRUE(readLayers("plane_top.exr", img));
    const double h = 2.0;
    for (int y = 0; y < 8; ++y)
        for (int x = 0; x < 8; ++x) {
            const double px = -4.0 + x + 0.5, py = -4.0 + y + 0.5;
            const double expected = h / std::pow(h * h + px * px + py * py, 1.5);
            EXPECT_NEAR(img.r[img.at(x, y)], expected, 0.005 * expected) << x << "," << y;
        }
}

TEST_F(RenderRun, SoftShadowsGiveTheSameBytesWhateverTheThreadCount) {
    // A plane, a triangle above it and an area light: shadow rays draw random numbers.
    mesh("thing.vtm", "thing",
         {{-10, -10, 0},
          {10, -10, 0},
          {10, 10, 0},
          {-10, -10, 0},
          {10, 10, 0},
          {-10, 10, 0},
          {-1, -1, 1},
          {1.5f, -0.5f, 1},
          {0, 1.5f, 1}});
    const float panel[4][4] = {{0.7f, 0, 0, 0}, {0, -0.7f, 0, 0}, {0, 0, -1, 0}, {3, 0, 3, 1}};
    scene(kTopCamera +
          "<LightSource><Name>panel</Name><Type>AREA</Type><Color><r>4</r><g>4</g><b>4</b><a>1</a>"
          "</Color><FalloffExponent>2</FalloffExponent><CastShadows>true</CastShadows>"
          "<ShadowSamples>8</ShadowSamples>" +
          oxtest::objectToWorldXml(panel) + "</LightSource>\n");
    std::ofstream("render.xml")
        << "<?xml version=\"1.0\"?>\n<OXConfig><FrameSettings><resolution><x>24</x><y>24</y>"
           "</resolution><tileSize><x>5</x><y>5</y></tileSize><cameraName>top</cameraName>"
           "</FrameSettings><AASettings><minSampleRate>-1</minSampleRate>"
           "<maxSampleRate>1</maxSampleRate></AASettings></OXConfig>\n";
    Layers one, three;
    for (const auto &[threads, name] : {std::pair{"1", "one"}, std::pair{"3", "three"}}) {
        const auto r = run({"-x", "render.xml", "-r", "-me", "-q", "-o", name, "-rt", threads});
        ASSERT_EQ(r.status, 0) << r.output;
    }
    ASSERT_TRUE(readLayers("one_top.exr", one));
    ASSERT_TRUE(readLayers("three_top.exr", three));
    EXPECT_EQ(one.r, three.r);
    EXPECT_EQ(one.z, three.z);
    // The shadow falls on the plane left of the triangle (x = -2, y = 0), away from the light:
    // darker than a point farther from the light beside it (x = -2, y = -3.3).
    EXPECT_LT(one.r[one.at(6, 12)], 0.5f * one.r[one.at(6, 2)]);
}

TEST_F(RenderRun, MissingCameraFallsBackToTheFirstAndWarnsOnce) {
    mesh("thing.vtm", "thing", {{-1, -1, 0}, {1, -1, 0}, {0, 1, 0}});
    scene(kCamera);
    // cameraName keeps its default "persp"; the statistics are shown.
    config("", "<outputVerbosity><benchmarkPrint>true</benchmarkPrint></outputVerbosity>");
    const auto r = run({"-x", "render.xml", "-r", "-t", "-q", "-o", "out/pic"});
    ASSERT_EQ(r.status, 0) << r.output;
    const std::string warning =
        "[WARNING]  Camera 'persp' not found in the scene, rendering with camera 'cam'.";
    const size_t first = r.output.find(warning);
    ASSERT_NE(first, std::string::npos) << r.output;
    EXPECT_EQ(r.output.find(warning, first + 1), std::string::npos);
    EXPECT_TRUE(fs::exists("out/pic_cam_beauty.tga"));
    EXPECT_NE(r.output.find("[BENCH]    Statistics for this run:"), std::string::npos);
    EXPECT_NE(r.output.find("[BENCH]        Primary rays: 64\n"), std::string::npos) << r.output;
}

}  // namespace
