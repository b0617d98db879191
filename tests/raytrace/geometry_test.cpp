#include <gtest/gtest.h>

#include "core/message.h"
#include "raytrace/instance.h"
#include "raytrace/shape.h"
#include "raytrace/vertex_list.h"
#include "tests/support/test_support.h"

namespace ox {
namespace {

// Captures what the message function prints while f runs, with debug messages switched on.
template <typename F>
std::string captureMessages(F &&f) {
    return oxtest::captureOutput(f, kMsgDebug);
}

TEST(VertexList, SetAccessRule) {
    VertexList list;
    list.resize(4, 0, false);
    // No sets: every vertex reads the shared zero entry, silently.
    std::string out = captureMessages([&] {
        auto uv = list.uvSet(3);
        EXPECT_FALSE(uv.isReal());
        EXPECT_EQ(uv[0], Vec2(0, 0));
        EXPECT_EQ(uv[3], Vec2(0, 0));
        EXPECT_EQ(list.tangentSet(0)[2], Vec3(0, 0, 0));
    });
    EXPECT_EQ(out, "");

    list.resize(4, 2, false);
    list.uvData(0)[3] = Vec2(0.25f, 0.5f);
    list.uvData(1)[3] = Vec2(0.75f, 1.0f);
    list.tangentData(0)[1] = Vec3(1, 0, 0);
    list.bitangentData(1)[2] = Vec3(0, 1, 0);
    EXPECT_EQ(list.uvSet(1)[3], Vec2(0.75f, 1.0f));
    EXPECT_EQ(list.bitangentSet(1)[2], Vec3(0, 1, 0));

    // Out of range: a debug message naming the set kind, index and count; set 0 answers.
    out = captureMessages([&] {
        EXPECT_EQ(list.uvSet(2)[3], Vec2(0.25f, 0.5f));
        EXPECT_EQ(list.tangentSet(5)[1], Vec3(1, 0, 0));
        EXPECT_EQ(list.bitangentSet(-1)[2], Vec3(0, 0, 0));
    });
    EXPECT_NE(out.find("[DEBUG]    Accessing uvset 2 on vertexlist with only 2 sets!"),
              std::string::npos);
    EXPECT_NE(out.find("Accessing tangentset 5 on vertexlist with only 2 sets!"),
              std::string::npos);
    EXPECT_NE(out.find("Accessing bitangentset -1 on vertexlist with only 2 sets!"),
              std::string::npos);

    list.setUvSetNames({"map1", "lightmap"});
    EXPECT_EQ(list.findUvSet("lightmap"), 1);
    EXPECT_EQ(list.findUvSet("LIGHTMAP"), -1);
}

TEST(Shape, MaterialsBoundsAndNormals) {
    Shape shape("quad");
    VertexList &v = shape.vertices();
    v.resize(4, 1, false);
    v.setPosition(0, {0, 0, 0});
    v.setPosition(1, {2, 0, 0});
    v.setPosition(2, {2, 0, -2});
    v.setPosition(3, {0, 3, -2});
    for (uint32_t i = 0; i < 4; ++i) v.normal(i) = Vec3(0, 1, 0);
    shape.triangles() = {{{0, 1, 2}, 0}, {{0, 2, 3}, 1}, {{0, 2, 3}, 7}};
    const MaterialHandle *a = reinterpret_cast<const MaterialHandle *>(0x10);
    const MaterialHandle *b = reinterpret_cast<const MaterialHandle *>(0x20);
    shape.materials() = {a, b};
    shape.computeBounds();
    EXPECT_EQ(shape.bounds(), BBox(Vec3(0, 0, -2), Vec3(2, 3, 0)));
    EXPECT_EQ(shape.material(0), a);
    EXPECT_EQ(shape.material(1), b);
    EXPECT_EQ(shape.material(2), nullptr);
    EXPECT_EQ(shape.faceNormal(0), Vec3(0, 4, 0));
    EXPECT_NEAR(shape.interpolatedNormal(1, 0.2f, 0.3f).length(), 1.0f, 1e-6f);

    // An instance override replaces every material of the shape; the shape keeps its own.
    const MaterialHandle *o = reinterpret_cast<const MaterialHandle *>(0x30);
    auto inst =
        Instance::create("i", Mtx4::translation({1, 0, 0}), &shape, o, RenderStats::kDefault);
    ASSERT_TRUE(inst);
    EXPECT_EQ(inst->material(0), o);
    EXPECT_EQ(shape.material(0), a);
    EXPECT_EQ(inst->worldBounds(), BBox(Vec3(1, 0, -2), Vec3(3, 3, 0)));
}

TEST(Instance, RejectsBadPlacementsAndKeepsFlags) {
    Shape shape("s");
    EXPECT_FALSE(Instance::create("a", Mtx4::scale({1, 0, 1}), &shape, nullptr, 0));
    Mtx4 nan;
    nan.m[3][1] = std::nanf("");
    EXPECT_FALSE(Instance::create("b", nan, &shape, nullptr, 0));
    EXPECT_FALSE(Instance::create("c", Mtx4(), nullptr, nullptr, 0));

    auto inst = Instance::create("d", Mtx4::scale({-2, 1, 1}), &shape, nullptr,
                                 kFlagCastShadows | kFlagSelfOcclusion);
    ASSERT_TRUE(inst);
    EXPECT_TRUE(inst->mirrors());
    EXPECT_TRUE(inst->hasFlag(kFlagSelfOcclusion));
    EXPECT_FALSE(inst->hasFlag(kFlagPrimaryVisibility));
    EXPECT_TRUE(inst->worldBounds().isEmpty());
    // Normals follow the inverse transpose: a scale of -2 in x halves and flips x.
    Vec3 n = inst->normalToWorld({1, 0, 0});
    EXPECT_FLOAT_EQ(n.x, -0.5f);
    EXPECT_EQ(inst->vertexBakeSamplingOptions(), nullptr);
    auto opts = std::make_unique<VertexBakeSamplingOptions>();
    opts->maxSamples = 16;
    inst->setVertexBakeSamplingOptions(std::move(opts));
    EXPECT_EQ(inst->vertexBakeSamplingOptions()->maxSamples, 16);
    EXPECT_EQ(inst->vertexBakeSamplingOptions()->type, VertexBakeSamplingOptions::kTriangleSubdiv);
    // The default flag word: everything on except Opposite, StaticGI, Envelop, IsImagePlane and
    // ShadowBias.
    EXPECT_EQ(RenderStats::kDefault, 0x4EDFFu);
}

}  // namespace
}  // namespace ox
