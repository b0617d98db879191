#pragma once

#include <array>
#include <memory>
#include <string>
#include <vector>

#include "core/types.h"
#include "raytrace/instance.h"
#include "raytrace/shape.h"
#include "scene/scene.h"

/// Scenes made in the tests: quads and boxes with light-map UVs, placed by a matrix.
namespace ox::test {

/// One corner of a test mesh: position, normal and the UVs of every set.
struct TestVertex {
    Vec3 p;
    Vec3 n{0, 0, 1};
    std::vector<Vec2> uv;
};

/// A shape from vertices and triangles; UV sets are named by setNames.
inline std::unique_ptr<Shape> makeShape(const std::string &name,
                                        const std::vector<TestVertex> &verts,
                                        const std::vector<std::array<uint32_t, 3>> &tris,
                                        const std::vector<std::string> &setNames) {
    auto shape = std::make_unique<Shape>(name);
    VertexList &vl = shape->vertices();
    vl.resize(0, uint32_t(setNames.size()), false);
    for (const TestVertex &v : verts) {
        std::vector<Vec2> uv = v.uv;
        uv.resize(setNames.size());
        vl.append(v.p, v.n, Color{}, uv.data(), Vec3{1, 0, 0}, Vec3{0, 1, 0});
    }
    vl.setUvSetNames(setNames);
    for (const auto &t : tris) shape->triangles().push_back(Triangle{{t[0], t[1], t[2]}, 0});
    shape->computeBounds();
    return shape;
}

/// A quad [x0, x1] x [y0, y1] at z = 0 facing +z, UV set "map" = uv rectangle given.
inline std::unique_ptr<Shape> makeQuad(const std::string &name, float x0, float y0, float x1,
                                       float y1, Vec2 uv0 = {0, 0}, Vec2 uv1 = {1, 1}) {
    return makeShape(name,
                     {{{x0, y0, 0}, {0, 0, 1}, {{uv0.x, uv0.y}}},
                      {{x1, y0, 0}, {0, 0, 1}, {{uv1.x, uv0.y}}},
                      {{x1, y1, 0}, {0, 0, 1}, {{uv1.x, uv1.y}}},
                      {{x0, y1, 0}, {0, 0, 1}, {{uv0.x, uv1.y}}}},
                     {{0, 1, 2}, {0, 2, 3}}, {"map"});
}

/// Adds shape and one instance of it (named instanceName) under placement m.
inline const Instance *place(Scene &scene, std::unique_ptr<Shape> shape,
                             const std::string &instanceName, const Mtx4 &m = Mtx4::identity()) {
    const Shape *s = shape.get();
    scene.addShape(std::move(shape));
    scene.addInstance(Instance::create(instanceName, m, s, nullptr, RenderStats::kDefault),
                      LinkMode::kNone, {});
    return scene.findInstance(instanceName);
}

}  // namespace ox::test
