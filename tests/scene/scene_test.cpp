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
    });
    // Duplicate shapes and cameras are checked through the loader.
    EXPECT_NE(out.find("[WARNING]  Duplicate instance name i, keeping the first one"),
              std::string::npos);
    EXPECT_NE(out.find("[WARNING]  Duplicate light name l, keeping the first one"),
              std::string::npos);
    EXPECT_EQ(scene.instances().size(), 1u);
    EXPECT_EQ(scene.lights().size(), 1u);
    EXPECT_EQ(static_cast<const SimpleAmbientLight *>(scene.findLight("l"))->color(),
              Color(1, 1, 1, 1));
    EXPECT_EQ(scene.instanceBounds(), BBox(Vec3(0, 0, 0), Vec3(1, 1, 1)));
    EXPECT_TRUE(scene.instanceBounds(0x2).isEmpty());
}

}  // namespace
}  // namespace ox
