#pragma once

#include <cstdint>
#include <string>

#include "core/types.h"
#include "raytrace/ray.h"

namespace ox {

/// What the camera knows of the environment its missed rays show: its identity only. The
/// shading code's environment shaders derive from it (environmentOf in shading/shader.h turns
/// it back). Never deleted through this type.
class EnvironmentHandle {
protected:
    EnvironmentHandle() = default;
    ~EnvironmentHandle() = default;
};

/// A camera turns an image point (and a lens point) into a primary ray with differentials.
class Camera {
public:
    /// Takes the camera frame from the rows of objectToWorld: right, up, backward, position.
    Camera(std::string name, const Mtx4 &objectToWorld, const EnvironmentHandle *env);
    virtual ~Camera();

    /// Fills ray for the image point in [0, 1]^2 and the lens point in [0, 1]^2.
    virtual void generateRay(const Vec2 &image, const Vec2 &lens, Ray &ray) const = 0;
    /// The camera position (last row of the placement).
    virtual Vec3 position() const = 0;
    /// Lens integer A (unused by the renderer).
    virtual int lensA() const { return 0; }
    /// Non-zero turns depth of field on.
    virtual int lensSwitch() const { return 0; }
    /// Lens ratio k.
    virtual float lensRatio() const { return 1.0f; }
    /// Focus distance f.
    virtual float focusDistance() const { return 1.0f; }
    /// Horizontal field of view in radians.
    virtual float fovX() const { return 1.0f; }
    /// Vertical field of view in radians.
    virtual float fovY() const { return 1.0f; }

    /// The camera's name.
    const std::string &name() const { return name_; }
    /// The placement the camera was built from.
    const Mtx4 &objectToWorld() const { return objectToWorld_; }
    /// The environment shown by rays that miss (may be null).
    const EnvironmentHandle *environment() const { return environment_; }

protected:
    std::string name_;
    Mtx4 objectToWorld_;
    const EnvironmentHandle *environment_;
    Vec3 right_, up_, back_, pos_;
};

/// Pinhole camera with an optional thin lens.
class PerspectiveCamera final : public Camera {
public:
    /// fovX, fovY in radians; shift of the image plane in units of the right and up vectors.
    PerspectiveCamera(std::string name, const Mtx4 &objectToWorld, const EnvironmentHandle *env,
                      float fovX, float fovY, const Vec2 &shift, int lensA = 0, int lensSwitch = 0,
                      float lensRatio = 0.0f, float focusDistance = 0.0f);

    void generateRay(const Vec2 &image, const Vec2 &lens, Ray &ray) const override;
    Vec3 position() const override { return pos_; }
    int lensA() const override { return lensA_; }
    int lensSwitch() const override { return lensSwitch_; }
    float lensRatio() const override { return lensRatio_; }
    float focusDistance() const override { return focus_; }
    float fovX() const override { return fovX_; }
    float fovY() const override { return fovY_; }

    /// Lens radius factor f * 0.5 / k; 0 when the lens is off or its parameters are not positive.
    float lensFactor() const { return lensFactor_; }
    /// True when rays start on the lens (depth of field).
    bool usesLens() const { return lensFactor_ > 0.0f; }

private:
    float fovX_, fovY_;
    Vec2 shift_;
    int lensA_, lensSwitch_;
    float lensRatio_, focus_;
    Vec3 h_, v_, c_, cUnit_, l1_, l2_;
    float lensFactor_ = 0.0f;
};

/// Parallel projection over a rectangle of the image plane.
class OrthoCamera final : public Camera {
public:
    /// imagePlaneSize: width and height of the view in world units.
    OrthoCamera(std::string name, const Mtx4 &objectToWorld, const EnvironmentHandle *env,
                const Vec2 &imagePlaneSize);

    void generateRay(const Vec2 &image, const Vec2 &lens, Ray &ray) const override;
    Vec3 position() const override { return pos_; }

private:
    Vec3 h_, v_, d_;
};

/// Panorama camera: cube-map cross, mirror ball or latitude-longitude, in world axes.
class EnvCamera final : public Camera {
public:
    /// Projection; the values are the indices of the scene's EnvironmentType.
    enum Projection : int { kCubeMap = 0, kBall = 1, kLatLong = 2 };

    /// Maps an EnvironmentType index to a projection; false for an index outside 0..2.
    static bool projectionFromIndex(int index, Projection &out);

    EnvCamera(std::string name, const Mtx4 &objectToWorld, const EnvironmentHandle *env,
              Projection projection);

    void generateRay(const Vec2 &image, const Vec2 &lens, Ray &ray) const override;
    Vec3 position() const override { return pos_; }

    /// The projection of this camera.
    Projection projection() const { return projection_; }
    /// Unnormalised-then-normalised direction for (s, t); false where the projection is empty.
    bool direction(float s, float t, Vec3 &dir) const;

private:
    Projection projection_;
};

}  // namespace ox
