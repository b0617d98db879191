#pragma once

#include <string>

#include "core/types.h"
#include "raytrace/camera.h"
#include "texture/texture.h"

namespace ox {

struct ShadingContext;

/// Base of every shader: surface, photon and environment shaders carry a name.
class ShaderInterfaceBase {
public:
    explicit ShaderInterfaceBase(std::string name) : name_(std::move(name)) {}
    virtual ~ShaderInterfaceBase() = default;
    ShaderInterfaceBase(const ShaderInterfaceBase &) = delete;
    ShaderInterfaceBase &operator=(const ShaderInterfaceBase &) = delete;

    /// The shader's name (materials: the scene name; photon twins: name + "_photon").
    const std::string &name() const { return name_; }

private:
    std::string name_;
};

/// The same base under the name the material code uses.
using MaterialInterface = ShaderInterfaceBase;

/// A surface shader: what a hit looks like.
class SurfaceShaderInterface : public ShaderInterfaceBase {
public:
    using ShaderInterfaceBase::ShaderInterfaceBase;
    /// The colour of the context's point under its component mask, multiplied by its colour
    /// weight (alpha = the weight's alpha). Called concurrently; must not allocate or lock.
    virtual Color shade(ShadingContext &ctx) const = 0;
    /// Shadowing at the point: the ratio of shadowed to unshadowed direct light as a grey
    /// colour in 0..1 (white where no light reaches it). Default: white.
    virtual Color shadow(ShadingContext &ctx) const;
    /// The colour a shadow ray keeps when it passes the surface (black: opaque). Default:
    /// black.
    virtual Color transmission(ShadingContext &ctx) const;
    /// The surface's albedo (its diffuse colour under white light of cosine 1) times the
    /// context's colour weight. Default: black.
    virtual Color albedo(ShadingContext &ctx) const;
};

/// What happens to a photon that hits a surface.
class PhotonShaderInterface : public ShaderInterfaceBase {
public:
    using ShaderInterfaceBase::ShaderInterfaceBase;
};

/// The colour of rays that leave the scene.
class EnvironmentShaderInterface : public ShaderInterfaceBase, public EnvironmentHandle {
public:
    using ShaderInterfaceBase::ShaderInterfaceBase;
    /// The colour seen along a unit direction, before the ray's colour weight.
    virtual Color evaluateDirection(const Vec3 &direction) const = 0;
    /// The colour of the context's ray (rayDirection), multiplied channel by channel by its
    /// colour weight. Default: evaluateDirection times the weight.
    virtual Color evaluate(const ShadingContext &ctx) const;
};

}  // namespace ox

namespace ox {

/// The surface shader of hits without a usable material: opaque black everywhere.
class DummySurfaceShader final : public SurfaceShaderInterface {
public:
    DummySurfaceShader() : SurfaceShaderInterface("dummySurfaceShader") {}
    /// Opaque black (0, 0, 0, 1).
    Color shade(ShadingContext &) const override { return Color(0, 0, 0, 1); }
    Color shadow(ShadingContext &) const override { return Color(0, 0, 0, 1); }
    Color transmission(ShadingContext &) const override { return Color(0, 0, 0, 1); }
    Color albedo(ShadingContext &) const override { return Color(0, 0, 0, 1); }
};

/// The environment shader behind the identity a camera holds (null stays null).
inline const EnvironmentShaderInterface *environmentOf(const EnvironmentHandle *e) {
    return static_cast<const EnvironmentShaderInterface *>(e);
}

}  // namespace ox
