#pragma once

#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <unordered_map>

#include "shading/shader.h"
#include "texture/texture_factory.h"

namespace ox {

/// A constant colour for every direction (colour raised to 1 / gamma at construction).
class ConstantEnvironmentShader : public EnvironmentShaderInterface {
public:
    ConstantEnvironmentShader(std::string name, const Color &color, float gamma = 1.0f);
    Color evaluateDirection(const Vec3 &) const override { return color_; }
    const Color &color() const { return color_; }

private:
    Color color_;
};

/// A gradient from the lower colour (straight down) to the upper colour (straight up), each
/// raised to 1 / gamma at construction and scaled by the intensity.
class GradientEnvironmentShader : public EnvironmentShaderInterface {
public:
    GradientEnvironmentShader(std::string name, const Color &upper, const Color &lower,
                              float intensity = 1.0f, float gamma = 1.0f);
    /// upper * (0.5 y + 0.5)^2 + lower * (0.5 - 0.5 y)^2 for the direction's y.
    Color evaluateDirection(const Vec3 &direction) const override;
    const Color &upper() const { return upper_; }
    const Color &lower() const { return lower_; }

private:
    Color upper_, lower_;
};

/// Where a unit direction meets a latitude-longitude light probe, the inverse of the image-based
/// light's layout (probeDirection turned by rotation about y, then y and z swapped with
/// swapYZ): u turns about the up axis from +x (u = 0) over +z (u = 0.25), v runs from 0
/// straight down to 1 straight up (row 0 of an image is its bottom row).
Vec2 probeUV(const Vec3 &direction, float rotation, bool swapYZ);

/// A light probe image around the scene: the image, a rotation about the up axis, whether Z is
/// up, and the blur used by GI rays.
class IBLEnvironmentShader : public EnvironmentShaderInterface {
public:
    IBLEnvironmentShader(std::string name, std::string imageFile, float turnDomeDegrees,
                         bool swapYZ, float giBlur);
    /// The probe at the direction (opaque black without a probe image).
    Color evaluateDirection(const Vec3 &direction) const override;
    /// The probe along the context's ray times its weight; GI rays read it blurred over a
    /// footprint of giBlur in u and v.
    Color evaluate(const ShadingContext &ctx) const override;
    /// Sets the probe image (loaded by the texture manager).
    void setProbe(std::shared_ptr<const OXTexture> probe) { probe_ = std::move(probe); }
    const OXTexture *probe() const { return probe_.get(); }
    const std::string &imageFile() const { return imageFile_; }
    /// The rotation in radians.
    float rotation() const { return rotation_; }
    bool swapYZ() const { return swapYZ_; }
    float giBlur() const { return giBlur_; }

private:
    std::string imageFile_;
    float rotation_;
    bool swapYZ_;
    float giBlur_;
    std::shared_ptr<const OXTexture> probe_;
};

/// The environment types of the environment settings ("None" 0, "Camera" 1, "SkyLight" 2,
/// "IBL" 3).
enum class EnvironmentKind : int32_t { kNone = 0, kCamera = 1, kSkyLight = 2, kIBL = 3 };

/// The values of the environment settings the scene needs.
struct EnvironmentValues {
    int32_t rtEnvironment = 1;
    float rtEnvironmentIntensity = 1.0f;
    int32_t giEnvironment = 1;
    float giEnvironmentIntensity = 1.0f;
    Color globalAmbientColor;
    Color skyLightColor;
    int32_t iblSamples = 300;
    std::string iblImageFile = "-";
    float iblIntensity = 1.0f;
    float iblBandingVsNoise = 1.0f;
    float iblTurnDome = 0.0f;
    float iblSpecularBoost = 1.0f;
    bool iblSwapYZ = false;
    bool iblEmitLight = false;
    bool iblEmitDiffuse = true;
    bool iblEmitSpecular = false;
    bool iblShadows = true;
    bool iblEmitPhotons = false;
    int32_t iblCausticsPhotons = 10000;
    int32_t iblGlobalPhotons = 10000;
    int32_t iblPhotonEnergy = 10000;
    float iblGIEnvBlur = 0.05f;
};

/// The scene's environment: the shader for ray-traced rays and the one for GI rays (either may
/// be null: rays that leave the scene see black), and the registry that owns the shaders, shared
/// by name ("ConstantEnvShader(<colour>)", "IBLEnv_<image>").
class Environment {
public:
    /// Makes the shaders the settings select; an image-based environment loads its probe
    /// through textures (when given). False (with the reason) when the probe image cannot be
    /// read.
    bool create(const EnvironmentValues &values, std::string &error,
                TextureFactory *textures = nullptr);

    const EnvironmentShaderInterface *rtShader() const { return rt_; }
    const EnvironmentShaderInterface *giShader() const { return gi_; }
    /// The registered shader of this name, or null.
    const EnvironmentShaderInterface *find(const std::string &name) const;
    /// Registers a shader unless its name is taken; returns the registered one.
    const EnvironmentShaderInterface *add(std::unique_ptr<EnvironmentShaderInterface> shader);
    /// Number of registered shaders.
    size_t size() const;

private:
    const EnvironmentShaderInterface *select(int32_t kind, const EnvironmentValues &values,
                                             std::string &error, TextureFactory *textures);

    mutable std::mutex mutex_;
    std::unordered_map<std::string, std::unique_ptr<EnvironmentShaderInterface>> shaders_;
    const EnvironmentShaderInterface *rt_ = nullptr;
    const EnvironmentShaderInterface *gi_ = nullptr;
};

/// The text of a colour as settings write it: "(r, g, b, a)" with four decimals.
std::string colorText(const Color &c);

}  // namespace ox
