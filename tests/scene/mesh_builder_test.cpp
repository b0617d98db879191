#include "scene/mesh_builder.h"

#include <gtest/gtest.h>

#include <cmath>
#include <thread>

#include "scene/temp_shape.h"
#include "scene_test_util.h"

namespace ox {
namespace {

using test::captureMessages;
using test::countOf;
using test::MeshMaker;
using test::TempDir;

// Knows the materials "a", "b" and "default"; hands out fake pointers.
struct FakeMaterials : ShapeMaterialResolverInterface {
    const Material *resolve(const std::string &name, const std::vector<std::string> &) override {
        if (name == "a") return reinterpret_cast<const Material *>(0x100);
        if (name == "b") return reinterpret_cast<const Material *>(0x200);
        if (name == "default") return reinterpret_cast<const Material *>(0x300);
        return nullptr;
    }
};

bool near(Vec3 got, Vec3 want, float eps = 2e-6f) { return (got - want).length() <= eps; }

struct Built {
    ShapeBuildStatus status = ShapeBuildStatus::kFailed;
    std::unique_ptr<Shape> shape;
    std::string failure, out;
};

// Opens and builds a mesh file as a run does; a file that does not open fails with a reason.
ShapeBuildStatus buildFile(const std::string &path, std::unique_ptr<Shape> &shape,
                           std::string &failure, const MeshBuildOptions &options = {}) {
    auto reader = vtm::TempMeshReaderFactory::instance().open(path, nullptr, &failure);
    FakeMaterials materials;
    return reader ? buildTempShape(*reader, materials, options, shape, failure)
                  : ShapeBuildStatus::kFailed;
}

// Builds a mesh through a file and keeps what it printed.
Built buildMesh(const vtm::TempMesh &mesh, const MeshBuildOptions &options = {},
                uint32_t version = 2) {
    TempDir dir;
    std::string path = dir.file("m.vtm");
    EXPECT_TRUE(vtm::writeTempMesh(path, mesh, version));
    Built b;
    b.out = captureMessages([&] { b.status = buildFile(path, b.shape, b.failure, options); });
    return b;
}

TEST(MeshBuilder, SkipsEmptyAndDegeneratedTriangles) {
    MeshMaker m("s", 0, true);  // colours, no UV sets
    uint32_t a = m.vertex({0, 0, 0}), b = m.vertex({1, 0, 0});
    uint32_t c = m.vertex({0, 1, 0}, {0, 0, 1}, {}, {}, Color(0, 0, 1, 0.5f));
    uint32_t nan = m.vertex({std::nanf(""), 0, 0});
    uint32_t a2 = m.vertex({0, 0, 0});  // a second vertex at a's position: two equal corners
    m.mesh.bounds = BBox(Vec3(0, 0, 0), Vec3(1, 1, 0));
    m.group("a", {a, b, c, a, a2, b, a, b, nan, nan, b, c, c, b, a});
    auto [status, shape, failure, out] = buildMesh(m.mesh);
    ASSERT_EQ(status, ShapeBuildStatus::kBuilt);
    EXPECT_EQ(shape->triangleCount(), 2u);  // the first and the reversed last
    EXPECT_EQ(countOf(out, "[DEBUG]    Empty triangle found, skipping it"), 1) << out;
    // The warning is printed once, then counted for the shape.
    EXPECT_EQ(countOf(out, "[WARNING]  Degenerated triangle found, skipping it"), 1) << out;
    EXPECT_NE(out.find("Repeated 1 more times in shape s: Degenerated triangle found"),
              std::string::npos);
    // Only used vertices survive, welded: a, b, c.
    EXPECT_EQ(shape->vertices().size(), 3u);
    EXPECT_EQ(shape->bounds(), BBox(Vec3(0, 0, 0), Vec3(1, 1, 0)));
    // Colours stay with their vertices; without UV sets every vertex reads the shared zero.
    ASSERT_TRUE(shape->vertices().hasColors());
    EXPECT_EQ(shape->vertices().color(shape->triangles()[0].v[2]), Color(0, 0, 1, 0.5f));
    EXPECT_EQ(shape->vertices().uvSet(0)[1], Vec2(0, 0));
}

TEST(MeshBuilder, RepairsNormalsAndUvs) {
    MeshMaker m("s", 2);
    // A normal of squared length 0.0025 is replaced by the face normal on every corner that
    // uses it; the two triangles have different face normals, so the vertex splits in two.
    uint32_t shared = m.vertex({0, 0, 0}, {0, 0, 0.05f});
    uint32_t b = m.vertex({1, 0, 0}), c = m.vertex({0, 1, 0});
    uint32_t d = m.vertex({0, 0, 1}, {1, 0, 0}, {}, {}, {}, {{INFINITY, 0.5f}, {0.25f, 0.75f}});
    m.mesh.bounds = BBox(Vec3(0, 0, 0), Vec3(1, 1, 1));
    m.group("a", {shared, b, c, shared, c, d});
    auto [status, shape, failure, out] = buildMesh(m.mesh);
    ASSERT_EQ(status, ShapeBuildStatus::kBuilt);
    EXPECT_EQ(shape->triangleCount(), 2u);
    EXPECT_EQ(countOf(out, "[WARNING]  Degenerated normal found, setting it to the face normal"),
              1);
    EXPECT_NE(out.find("Repeated 1 more times in shape s: Degenerated normal"), std::string::npos);
    EXPECT_EQ(countOf(out, "[WARNING]  Invalid UV added to meshificator, setting it to 0"), 1);
    const VertexList &v = shape->vertices();
    EXPECT_EQ(v.size(), 5u);
    const Triangle &t0 = shape->triangles()[0], &t1 = shape->triangles()[1];
    EXPECT_NE(t0.v[0], t1.v[0]);
    EXPECT_EQ(v.normal(t0.v[0]), Vec3(0, 0, 1));
    EXPECT_EQ(v.normal(t1.v[0]), Vec3(1, 0, 0));
    EXPECT_EQ(v.uvSet(0)[t1.v[2]], Vec2(0, 0.5f));
    EXPECT_EQ(v.uvSet(1)[t1.v[2]], Vec2(0.25f, 0.75f));
}

TEST(MeshBuilder, WeldsByDistanceAndAttributes) {
    auto build = [](float offset, Vec2 uv, Color color, Vec3 normal, float threshold) {
        MeshMaker m("w", 1, true);
        // White corners a, b, c, d with UV = (x, y), and b2 near b with the attributes given.
        for (Vec3 p : {Vec3(0, 0, 0), Vec3(1, 0, 0), Vec3(0, 1, 0), Vec3(1, 1, 0)})
            m.vertex(p, {0, 0, 1}, {}, {}, {1, 1, 1, 1});
        uint32_t b2 = m.vertex({1 + offset, 0, 0}, normal, {}, {}, color, {uv});
        m.group("a", {0, 1, 2, b2, 3, 2});
        MeshBuildOptions o;
        o.mergeThreshold = threshold;
        Built r = buildMesh(m.mesh, o);
        return r.shape ? r.shape->vertices().size() : 0u;
    };
    const Color white(1, 1, 1, 1);
    const Vec3 up(0, 0, 1);
    EXPECT_EQ(build(0, {1, 0}, white, up, 0.001f), 4u);        // same position: welded
    EXPECT_EQ(build(0.0009f, {1, 0}, white, up, 0.001f), 4u);  // closer than the threshold
    EXPECT_EQ(build(0.0011f, {1, 0}, white, up, 0.001f), 5u);  // farther
    EXPECT_EQ(build(0.02f, {1, 0}, white, up, 0.05f), 4u);     // an absolute distance
    EXPECT_EQ(build(0.0005f, {1, 0}, white, up, 0.0f), 5u);    // 0: exact positions only
    EXPECT_EQ(build(0, {1, 0}, white, up, 0.0f), 4u);
    EXPECT_EQ(build(0, {1, 1e-6f}, white, up, 0.001f), 5u);  // UVs differ
    EXPECT_EQ(build(0, {1, 1e-8f}, white, up, 0.001f), 4u);
    EXPECT_EQ(build(0, {1, 0}, Color(1, 1, 1, 0.99998f), up, 0.001f), 5u);  // colours differ
    EXPECT_EQ(build(0, {1, 0}, Color(1, 1, 1, 0.999995f), up, 0.001f), 4u);
    EXPECT_EQ(build(0, {1, 0}, white, Vec3(0, 0.002f, 1), 0.001f), 5u);  // normals differ
    EXPECT_EQ(build(0, {1, 0}, white, Vec3(0, 0.0005f, 1), 0.001f), 4u);
    EXPECT_EQ(build(0, {1, 0}, white, up, std::nanf("")), 4u);  // a bad threshold: exact only
}

TEST(MeshBuilder, WeldIsDeterministicAcrossThreads) {
    // A jittered grid with duplicated corners: every quad has its own four vertices.
    MeshMaker m("g", 1);
    std::vector<uint32_t> idx;
    uint32_t seed = 12345;
    auto jitter = [&] {
        seed = seed * 1103515245u + 12345u;
        return ((seed >> 16) & 0xFF) * 1e-6f;
    };
    for (int y = 0; y < 30; ++y)
        for (int x = 0; x < 30; ++x) {
            auto corner = [&](int u, int v) {
                return m.vertex({u + jitter(), v + jitter(), 0}, {0, 0, 1}, {}, {}, {},
                                {{float(u), float(v)}});
            };
            uint32_t a = corner(x, y), b = corner(x + 1, y), c = corner(x, y + 1),
                     d = corner(x + 1, y + 1);
            idx.insert(idx.end(), {a, b, d, a, d, c});
        }
    m.group("a", idx);
    TempDir dir;
    std::string path = dir.file("g.vtm");
    ASSERT_TRUE(vtm::writeTempMesh(path, m.mesh, 1));
    std::vector<std::unique_ptr<Shape>> shapes(4);
    std::vector<std::thread> threads;
    for (auto &s : shapes)
        threads.emplace_back([&s, &path] {
            std::string failure;
            buildFile(path, s, failure);
        });
    for (auto &t : threads) t.join();
    for (auto &s : shapes) ASSERT_TRUE(s);
    // Shared corners weld (jitter < 0.001); the UVs are continuous, so 31 x 31 vertices remain.
    EXPECT_EQ(shapes[0]->vertices().size(), 31u * 31u);
    for (size_t i = 1; i < shapes.size(); ++i) {
        EXPECT_EQ(shapes[i]->triangles(), shapes[0]->triangles());
        for (uint32_t v = 0; v < shapes[0]->vertices().size(); ++v)
            ASSERT_EQ(shapes[i]->vertices().position(v), shapes[0]->vertices().position(v));
    }
}

TEST(MeshBuilder, ComputesTangentFrames) {
    auto build = [](std::vector<Vec2> uvs, TangentSpaceOptions ts, Vec3 givenTangent = {}) {
        MeshMaker m("t", 1);
        for (Vec3 p : {Vec3(0, 0, 0), Vec3(1, 0, 0), Vec3(1, 1, 0)})
            m.vertex(p, {0, 0, 1}, givenTangent, {}, {}, {uvs[m.mesh.vertexCount()]});
        m.group("a", {0, 1, 2});
        MeshBuildOptions o;
        o.tangentSpace = ts;
        return buildMesh(m.mesh, o).shape;
    };
    auto s = build({{0, 0}, {1, 0}, {1, 1}}, {});
    ASSERT_TRUE(s);
    for (uint32_t i = 0; i < 3; ++i) {
        EXPECT_TRUE(near(s->vertices().tangentSet(0)[i], {1, 0, 0})) << i;
        EXPECT_TRUE(near(s->vertices().bitangentSet(0)[i], {0, 1, 0})) << i;
    }
    // Without orthogonalisation and normalisation the sums keep the corner weights (angle / pi):
    // 1/4, 1/2, 1/4 here.
    s = build({{0, 0}, {1, 0}, {1, 1}}, {true, false, false});
    EXPECT_TRUE(near(s->vertices().tangentSet(0)[0], {0.25f, 0, 0}, 1e-5f));
    EXPECT_TRUE(near(s->vertices().tangentSet(0)[1], {0.5f, 0, 0}, 1e-5f));
    // Mirrored UVs: det < 0 flips the frame when flipping is on.
    s = build({{0, 0}, {-1, 0}, {-1, 1}}, {true, true, true});
    EXPECT_TRUE(near(s->vertices().tangentSet(0)[0], {1, 0, 0}));
    EXPECT_TRUE(near(s->vertices().bitangentSet(0)[0], {0, -1, 0}));
    s = build({{0, 0}, {-1, 0}, {-1, 1}}, {false, true, true});
    EXPECT_TRUE(near(s->vertices().tangentSet(0)[0], {-1, 0, 0}));
    EXPECT_TRUE(near(s->vertices().bitangentSet(0)[0], {0, 1, 0}));
    // Collinear UVs give zero frames, and stay zero through the repair.
    s = build({{0, 0}, {1, 1}, {2, 2}}, {});
    EXPECT_EQ(s->vertices().tangentSet(0)[1], Vec3(0, 0, 0));
    EXPECT_EQ(s->vertices().bitangentSet(0)[1], Vec3(0, 0, 0));
    // A frame in the file is used as given (orthogonalised to the normal and normalised).
    s = build({{0, 0}, {1, 1}, {2, 2}}, {}, Vec3(0, 2, 1));
    EXPECT_TRUE(near(s->vertices().tangentSet(0)[0], {0, 1, 0}));
}

TEST(MeshBuilder, RepairsTangentFrames) {
    RepairLog log;
    TangentSpaceOptions all;
    Vec3 n(0, 0, 2), t(NAN, 0, 0), b(0, 1, 0);
    std::string out = captureMessages([&] { repairTangentFrame(n, t, b, all, log); });
    EXPECT_NE(out.find("[WARNING]  Degenerated tangent found, repairing it"), std::string::npos);
    EXPECT_EQ(n, Vec3(0, 0, 1));
    EXPECT_TRUE(near(t, {1, 0, 0}));  // B x N
    EXPECT_TRUE(near(b, {0, 1, 0}));
    // Both broken: a perpendicular of the normal, then B = N x T.
    n = Vec3(0, 1, 0), t = Vec3(INFINITY, 0, 0), b = Vec3(NAN, 0, 0);
    out = captureMessages([&] { repairTangentFrame(n, t, b, all, log); });
    EXPECT_NE(out.find("Degenerated bitangent found, repairing it"), std::string::npos);
    EXPECT_NEAR(dot(t, n), 0.0f, 1e-6f);
    EXPECT_NEAR(t.length(), 1.0f, 1e-6f);
    EXPECT_NEAR(dot(b, n), 0.0f, 1e-6f);
    // Orthogonalisation removes the normal part and the tangent part of B.
    n = Vec3(0, 0, 1), t = Vec3(1, 0, 1), b = Vec3(1, 1, 1);
    repairTangentFrame(n, t, b, all, log);
    EXPECT_TRUE(near(t, {1, 0, 0}));
    EXPECT_TRUE(near(b, {0, 1, 0}));
    // Neither option: only the normal is normalised.
    n = Vec3(0, 0, 3), t = Vec3(2, 0, 1), b = Vec3(0, 2, 0);
    repairTangentFrame(n, t, b, {true, false, false}, log);
    EXPECT_EQ(t, Vec3(2, 0, 1));
    EXPECT_EQ(n, Vec3(0, 0, 1));
    EXPECT_EQ(log.count(RepairLog::kDegeneratedTangent), 2u);
}

TEST(TempShape, MaterialsIndicesAndEmptyMeshes) {
    MeshMaker m("s", 0);
    m.grid(2, 1, "a");
    m.group("nope", {0, 1, 4});
    Built r = buildMesh(m.mesh);
    EXPECT_EQ(r.status, ShapeBuildStatus::kFailed);
    EXPECT_EQ(r.failure, "Material nope not defined when loading shape s");
    EXPECT_NE(r.out.find("[ERROR]    Material nope not defined when loading shape s"),
              std::string::npos);
    EXPECT_FALSE(r.shape);

    m.mesh.groups.back().name = "b";
    m.mesh.indices.back() = 6;  // one past the last vertex
    r = buildMesh(m.mesh);
    EXPECT_EQ(r.status, ShapeBuildStatus::kFailed);
    EXPECT_EQ(r.failure, "Triangle 4 of shape s refers to vertex 6, but the shape has 6 vertices");

    m.mesh.indices.back() = 5;
    r = buildMesh(m.mesh, {}, 1);
    ASSERT_EQ(r.status, ShapeBuildStatus::kBuilt);
    EXPECT_EQ(r.shape->triangleCount(), 5u);
    EXPECT_EQ(r.shape->material(4), reinterpret_cast<const MaterialHandle *>(0x200));
    EXPECT_EQ(r.shape->material(0), reinterpret_cast<const MaterialHandle *>(0x100));

    MeshMaker e("e", 1);
    e.mesh.groups.push_back({"nope", 0});
    e.mesh.bounds = BBox(Vec3(0, 0, 0), Vec3(0, 0, 0));
    r = buildMesh(e.mesh);
    EXPECT_EQ(r.status, ShapeBuildStatus::kEmpty);
    EXPECT_FALSE(r.shape);
}

TEST(TempShape, EveryDamagedByteFailsOrRepairsCleanly) {
    // Each byte of a small valid file in turn set to 0xFF: the open fails, the build fails with
    // a reason, or the shape is built from repaired data; nothing else may happen.
    MeshMaker m("s", 2, true);
    m.grid(2, 1, "a");
    TempDir dir;
    std::string path = dir.file("ok.vtm");
    ASSERT_TRUE(vtm::writeTempMesh(path, m.mesh, 2));
    const std::vector<unsigned char> good = test::readBytes(path);
    int built = 0, failed = 0;
    std::string out = captureMessages([&] {
        for (size_t i = 0; i < good.size(); ++i) {
            std::vector<unsigned char> bad = good;
            bad[i] = 0xFF;
            test::writeBytes(path, bad);
            std::unique_ptr<Shape> shape;
            std::string failure;
            ShapeBuildStatus st = buildFile(path, shape, failure);
            if (st == ShapeBuildStatus::kFailed) {
                EXPECT_FALSE(failure.empty());
                ++failed;
            } else if (st == ShapeBuildStatus::kBuilt) {
                ASSERT_TRUE(shape);
                for (const Triangle &t : shape->triangles())
                    for (uint32_t v : t.v) ASSERT_LT(v, shape->vertices().size());
                ++built;
            }
        }
    });
    EXPECT_GT(built, 0);
    EXPECT_GT(failed, 0);
}

}  // namespace
}  // namespace ox
