#pragma once

#include <string>

#include "core/types.h"
#include "raytrace/camera.h"

namespace ox {

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

/// A surface shader: what a hit looks like. The shading operations come with the shading code.
class SurfaceShaderInterface : public ShaderInterfaceBase {
public:
    using ShaderInterfaceBase::ShaderInterfaceBase;
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
};

/// The environment shader behind the identity a camera holds (null stays null).
inline const EnvironmentShaderInterface *environmentOf(const EnvironmentHandle *e) {
    return static_cast<const EnvironmentShaderInterface *>(e);
}

}  // namespace ox
