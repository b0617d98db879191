#include "scene/scene.h"

#include <gtest/gtest.h>

#include "scene_test_util.h"

namespace ox {
namespace {

std::unique_ptr<Shape> boxShape(const std::string &name, Vec3 lo, Vec3 hi) {
    auto s = std::make_unique<Shape>(name);
    s->setBounds(BBox(lo, hi));
    return s;
}

TEST(Scene, FirstNameWinsPerKind) {
    Scene scene;
    std::string out = test::captureMessages([&] {
        EXPECT_TRUE(scene.addShape(boxShape("s", {0, 0, 0}, {1, 1, 1})));
        EXPECT_FALSE(scene.addShape(boxShape("s", {5, 5, 5}, {6, 6, 6})));
        const Shape *s = scene.findShape("s");
        EXPECT_TRUE(
            scene.addInstance(Instance::create("i", Mtx4(), s, nullptr, 1), LinkMode::kNone, {}));
        EXPECT_FALSE(
            scene.addInstance(Instance::create("i", Mtx4::translation({9, 9, 9}), s, nullptr, 1),
                              LinkMode::kNone, {}));
        EXPECT_TRUE(scene.addLight(std::make_unique<SimpleAmbientLight>("l", Color(1, 1, 1, 1)),
                                   LinkMode::kNone, {}));
        EXPECT_FALSE(scene.addLight(std::make_unique<SimpleAmbientLight>("l", Color()),
                                    LinkMode::kNone, {}));
        EXPECT_TRUE(
            scene.addCamera(std::make_unique<OrthoCamera>("c", Mtx4(), nullptr, Vec2(1, 1))));
        EXPECT_FALSE(
            scene.addCamera(std::make_unique<OrthoCamera>("c", Mtx4(), nullptr, Vec2(2, 2))));
    });
    for (const char *want :
         {"[WARNING]  Duplicate shape name s, keeping the first one", "Duplicate instance name i",
          "Duplicate light name l", "Duplicate camera name c"})
        EXPECT_NE(out.find(want), std::string::npos) << want;
    EXPECT_EQ(scene.shapes().size(), 1u);
    EXPECT_EQ(scene.findShape("s")->bounds().max, Vec3(1, 1, 1));
    EXPECT_EQ(scene.instances().size(), 1u);
    EXPECT_EQ(scene.lights().size(), 1u);
    EXPECT_EQ(static_cast<const SimpleAmbientLight *>(scene.findLight("l"))->color(),
              Color(1, 1, 1, 1));
    EXPECT_EQ(scene.cameras().size(), 1u);
    EXPECT_EQ(scene.instanceBounds(), BBox(Vec3(0, 0, 0), Vec3(1, 1, 1)));
    EXPECT_TRUE(scene.instanceBounds(0x2).isEmpty());
}

}  // namespace
}  // namespace ox
