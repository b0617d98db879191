#pragma once

#include <memory>
#include <vector>

#include "core/random.h"
#include "shading/light.h"
#include "shading/phong.h"
#include "shading/shading_context.h"

/// A small shading world for the tests: lights made from scene parameters, a scene and a
/// context on the plane z = 0 (normal +z, tangent +x) seen from straight above.
namespace oxtest {

/// A texture of one colour everywhere that remembers where it was last looked up.
class ConstantTexture : public ox::OXTexture {
public:
    explicit ConstantTexture(const ox::Color &c) : color_(c) {}
    ox::Color lookup(const ox::TextureLookup &at) const override {
        lastUv = ox::Vec2(at.u, at.v);
        return color_;
    }
    bool readPixels(const ox::Region &, ox::Color *) const override { return false; }
    ox::Vec2i resolution() const override { return {1, 1}; }
    bool isHDR() const override { return false; }
    mutable ox::Vec2 lastUv;

private:
    ox::Color color_;
};

/// A point light at p with (1 / d)^2 falloff, without shadows unless asked.
inline std::unique_ptr<ox::LightSource> pointLight(const ox::Vec3 &p,
                                                   const ox::Color &c = ox::Color::white(),
                                                   bool castShadows = false) {
    ox::LightParameters lp;
    lp.name = "point";
    lp.type = ox::LightType::kPoint;
    lp.color = c;
    lp.falloffExponent = 2.0f;
    lp.decayClampToOne = false;
    lp.castShadows = castShadows;
    lp.objectToWorld = ox::Mtx4::translation(p);
    bool shadows = false;
    return ox::createLight(lp, shadows);
}

/// A white directional light shining from the unit direction towards (towards the light).
inline std::unique_ptr<ox::LightSource> directionalLight(const ox::Vec3 &towards,
                                                         const ox::Color &c = ox::Color::white()) {
    ox::LightParameters lp;
    lp.name = "sun";
    lp.type = ox::LightType::kDirectional;
    lp.color = c;
    lp.castShadows = false;
    // The light shines along its local -y: map local y onto the wanted direction.
    const ox::Vec3 y = towards.normalized();
    const ox::Vec3 a = std::fabs(y.x) < 0.9f ? ox::Vec3(1, 0, 0) : ox::Vec3(0, 1, 0);
    const ox::Vec3 x = ox::cross(a, y).normalized();
    const ox::Vec3 z = ox::cross(x, y);
    ox::Mtx4 m;
    for (int i = 0; i < 3; ++i) m.m[0][i] = x[i], m.m[1][i] = y[i], m.m[2][i] = z[i];
    lp.objectToWorld = m;
    bool shadows = false;
    return ox::createLight(lp, shadows);
}

/// Lights, scene and one context over them.
struct World {
    std::vector<std::unique_ptr<ox::LightSource>> owned;
    std::vector<const ox::LightSource *> lights;
    ox::ShadingScene scene;
    ox::Random random{1};
    ox::ShadingContext ctx;

    void add(std::unique_ptr<ox::LightSource> l) {
        lights.push_back(l.get());
        owned.push_back(std::move(l));
        scene.lights = lights.data();
        scene.lightCount = uint32_t(lights.size());
    }
    /// A camera sample at p on the plane z = 0 seen along direction (default straight down).
    ox::ShadingContext &at(const ox::Vec3 &p, const ox::Vec3 &dir = ox::Vec3(0, 0, -1)) {
        ctx.scene = &scene;
        ctx.random = &random;
        ctx.beginSample(p - dir, dir.normalized());
        ctx.surface = ox::SurfacePoint();
        ctx.surface.position = p;
        ctx.surface.geometricNormal = ctx.surface.normal = ox::Vec3(0, 0, 1);
        ctx.surface.tangent = ox::Vec3(1, 0, 0);
        ctx.surface.bitangent = ox::Vec3(0, 1, 0);
        ctx.surface.uvSetCount = 1;
        ctx.surface.uvs[0].uv = ox::Vec2(p.x, p.y);
        ctx.surface.backSide = dir.z > 0.0f;
        return ctx;
    }
};

/// Parameters of a material of diffuse colour d and nothing else.
inline ox::PhongParameters diffuseMaterial(const ox::Color &d) {
    ox::PhongParameters p;
    p.channels[ox::kPhongDiffuse].color = d;
    return p;
}

}  // namespace oxtest
