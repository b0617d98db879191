#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "core/types.h"
#include "raytrace/ray.h"
#include "shading/environment.h"

namespace ox {

/// Distance falloff of a light.
class AttenuationSettings {
public:
    explicit AttenuationSettings(float exponent) : exponent_(exponent) {}
    virtual ~AttenuationSettings() = default;
    /// The factor at distance d from the light.
    virtual float attenuate(float d) const = 0;
    float exponent() const { return exponent_; }

protected:
    float exponent_;
};

/// (1 / d) ^ exponent.
class StandardAttenuation : public AttenuationSettings {
public:
    using AttenuationSettings::AttenuationSettings;
    float attenuate(float d) const override;
};

/// min(1, (1 / d) ^ exponent).
class ClampedStandardAttenuation : public AttenuationSettings {
public:
    using AttenuationSettings::AttenuationSettings;
    float attenuate(float d) const override;
};

/// (max(0, 1 - (d / radius)^2)) ^ exponent: zero at and beyond the radius.
class UnrealAttenuation : public AttenuationSettings {
public:
    UnrealAttenuation(float exponent, float radius)
        : AttenuationSettings(exponent), radius_(radius) {}
    float attenuate(float d) const override;
    float radius() const { return radius_; }

private:
    float radius_;
};

/// One entry of a light's colour ramp as the scene gives it.
struct RampEntry {
    float r = 0, g = 0, b = 0, pos = 0;
};

/// A light colour ramp: colours (r, g, b, 1) at increasing positions.
class LightRamp {
public:
    LightRamp() = default;
    /// Sorts the entries by position (entries at one position keep their order); entries with
    /// a non-finite position are dropped.
    explicit LightRamp(const std::vector<RampEntry> &entries);
    bool empty() const { return colors_.empty(); }
    const std::vector<Color> &colors() const { return colors_; }
    const std::vector<float> &positions() const { return positions_; }
    /// The colour at x: white without entries, the first colour below 0, black above 1,
    /// otherwise linear between the neighbouring entries.
    Color lookup(float x) const;

private:
    std::vector<Color> colors_;
    std::vector<float> positions_;
};

/// How a light's shadow sampler samples (the sampler itself comes with the shadow code).
struct ShadowSamplerSettings {
    enum Kind : int { kNone, kPoint, kArea, kDirectional };
    Kind kind = kNone;
    /// Disk radius (point), cone angle (directional) or 0 (area: the rectangle).
    float size = 0.0f;
    /// Samples, at most 256 and at least 1.
    uint32_t samples = 1;
    uint32_t minSamples = 0;
    int depthLimit = 10;
    /// Window lights clip their rays at the window plane.
    bool clipAtPlane = false;
};

/// Photon emission of a light (counts and power).
struct PhotonEmission {
    int32_t diffusePhotons = 0;
    int32_t specularPhotons = 0;
    Color power;
};

/// The light types of the scene ("POINT" 0 ... "ENVIRONMENT" 5).
enum class LightType : int32_t {
    kPoint = 0,
    kDirectional = 1,
    kSpot = 2,
    kArea = 3,
    kWindow = 4,
    kEnvironment = 5
};

/// Everything a scene light is made from (the members of a LightSource element).
struct LightParameters {
    std::string name;
    Color color;
    Color lowerColor;
    int32_t type = 0;
    bool castShadows = true;
    int32_t diffusePhotons = 0;
    int32_t specularPhotons = 0;
    float photonIntensity = 0.0f;
    float falloffExponent = 0.0f;
    float decayStart = 0.0f;
    float decayCutoff = 3.4028235e38f;
    bool decayClampToOne = true;
    float directionalLightShadowAngle = 0.0f;
    float pointLightShadowRadius = 0.0f;
    float spotLightConeAngle = 0.0f;
    float spotLightPenumbraAngle = 0.0f;
    float spotLightPenumbraExponent = 0.0f;
    float spotLightShadowRadius = 0.0f;
    std::string spotLightGoboTexture;
    float directLightScale = 1.0f;
    float indirectLightScale = 1.0f;
    std::vector<RampEntry> lightRampColors;
    bool clampToIntensity = false;
    int32_t shadowSamples = 1;
    uint32_t minShadowSamples = 0;
    int32_t attenuationType = 0;  ///< "STANDARD" 0, "UNREAL" 1
    Mtx4 objectToWorld;
};

/// Light flag bits (the shading component bits a light feeds).
constexpr uint32_t kLightDiffuse = 0x1, kLightSpecular = 0x2, kLightAmbient = 0x4,
                   kLightShadows = 0x40, kLightIndirect = 0x100;

/// A light of the scene: name, flags, world box of its influence, intensity scale per ray type
/// and photon emission. The illumination operations come with the light code.
class LightSource {
public:
    explicit LightSource(std::string name);
    virtual ~LightSource() = default;
    LightSource(const LightSource &) = delete;
    LightSource &operator=(const LightSource &) = delete;

    /// The class name of the light (for summaries).
    virtual const char *className() const = 0;

    const std::string &name() const { return name_; }
    uint32_t flags() const { return flags_; }
    bool hasFlag(uint32_t bit) const { return (flags_ & bit) != 0; }
    /// Sets or clears one flag bit.
    void setFlag(uint32_t bit, bool on) { flags_ = on ? (flags_ | bit) : (flags_ & ~bit); }
    const BBox &bounds() const { return bounds_; }
    /// Scale of the light for a ray type (1 for types outside 0..10).
    float intensityScale(int rayType) const {
        return rayType >= 0 && rayType < kRayTypeCount ? scales_[rayType] : 1.0f;
    }
    void setIntensityScale(int rayType, float s) {
        if (rayType >= 0 && rayType < kRayTypeCount) scales_[rayType] = s;
    }
    const PhotonEmission &photonEmission() const { return photons_; }

protected:
    std::string name_;
    uint32_t flags_ = 0;
    BBox bounds_;
    float scales_[kRayTypeCount];
    PhotonEmission photons_;
};

/// Base of the scene's direct lights: colour, placement, attenuation and shadow sampling.
class SimpleLightSourceBase : public LightSource {
public:
    explicit SimpleLightSourceBase(const LightParameters &p);

    const Color &color() const { return color_; }
    const Mtx4 &objectToWorld() const { return objectToWorld_; }
    const Mtx4 &worldToLight() const { return worldToLight_; }
    /// The attenuation (null for lights without one).
    const AttenuationSettings *attenuation() const { return attenuation_.get(); }
    const ShadowSamplerSettings &shadowSampler() const { return shadow_; }

protected:
    Color color_;
    Mtx4 objectToWorld_;
    Mtx4 worldToLight_;
    std::unique_ptr<AttenuationSettings> attenuation_;
    ShadowSamplerSettings shadow_;
};

/// A point light at the placement's origin, with an optional colour ramp.
class SimplePointLight : public SimpleLightSourceBase {
public:
    explicit SimplePointLight(const LightParameters &p);
    const char *className() const override { return "SimplePointLight"; }
    const Vec3 &position() const { return position_; }
    const LightRamp &ramp() const { return ramp_; }
    /// DecayCutoff squared.
    float cutoffSquared() const { return cutoff2_; }

protected:
    Vec3 position_;
    LightRamp ramp_;
    float cutoff2_;
};

/// A spot light: a point light with a cone along the light's -y axis and an optional gobo.
class SimpleSpotLight : public SimplePointLight {
public:
    explicit SimpleSpotLight(const LightParameters &p);
    const char *className() const override { return "SimpleSpotLight"; }
    const Vec3 &axis() const { return axis_; }
    float cosOuter() const { return cosOuter_; }
    float cosInner() const { return cosInner_; }
    float penumbraExponent() const { return penumbraExponent_; }
    bool hasGobo() const { return hasGobo_; }
    const std::string &goboFile() const { return goboFile_; }
    const Vec3 &goboU() const { return goboU_; }
    const Vec3 &goboV() const { return goboV_; }
    float goboScale() const { return goboScale_; }

private:
    Vec3 axis_;
    float cosOuter_, cosInner_, penumbraExponent_;
    bool hasGobo_ = false;
    std::string goboFile_;
    Vec3 goboU_, goboV_;
    float goboScale_ = 0.0f;
};

/// A directional light: parallel light from the direction the placement turns (0, -1, 0) to.
class SimpleDirectionalLight : public SimpleLightSourceBase {
public:
    explicit SimpleDirectionalLight(const LightParameters &p);
    const char *className() const override { return "SimpleDirectionalLight"; }
    /// Unit vector towards the light.
    const Vec3 &direction() const { return direction_; }

private:
    Vec3 direction_;
};

/// An area light: the square -1..1 in the light's x-y plane, lighting the +z side.
class SimpleAreaLight : public SimpleLightSourceBase {
public:
    explicit SimpleAreaLight(const LightParameters &p);
    const char *className() const override { return "SimpleAreaLight"; }
    const Vec3 &center() const { return center_; }
    const Vec3 &normal() const { return normal_; }
    bool clampToIntensity() const { return clampToIntensity_; }
    /// The four corners in world space.
    const Vec3 *corners() const { return corners_; }

protected:
    Vec3 center_, normal_;
    Vec3 corners_[4];
    bool clampToIntensity_;
};

/// A window light: an area light whose light passes as directional light within a half angle.
class SimpleWindowLight : public SimpleAreaLight {
public:
    explicit SimpleWindowLight(const LightParameters &p);
    const char *className() const override { return "SimpleWindowLight"; }
    float halfAngle() const { return halfAngle_; }
    float tanHalfAngle() const { return tanHalfAngle_; }

private:
    float halfAngle_, tanHalfAngle_;
};

/// An ambient light: the same colour from everywhere.
class SimpleAmbientLight : public LightSource {
public:
    SimpleAmbientLight(std::string name, const Color &color);
    const char *className() const override { return "SimpleAmbientLight"; }
    const Color &color() const { return color_; }

private:
    Color color_;
};

/// A light from an environment shader (owned).
class EnvironmentLight : public LightSource {
public:
    EnvironmentLight(std::string name, std::unique_ptr<EnvironmentShaderInterface> shader,
                     bool castShadows);
    const char *className() const override { return "EnvironmentLight"; }
    const EnvironmentShaderInterface &shader() const { return *shader_; }

private:
    std::unique_ptr<EnvironmentShaderInterface> shader_;
};

/// The image-based light of the environment settings: its parameters (the probe is split into
/// sub-lights by the light code).
class KDHDRLight : public LightSource {
public:
    explicit KDHDRLight(const EnvironmentValues &values);
    const char *className() const override { return "KDHDRLight"; }
    /// 2^k sub-lights for the smallest k with 2^k >= iblSamples.
    uint32_t subLightCount() const { return subLights_; }
    float intensity() const { return intensity_; }
    float bandingVsNoise() const { return bandingVsNoise_; }
    float turnDome() const { return turnDome_; }
    float specularBoost() const { return specularBoost_; }
    bool swapYZ() const { return swapYZ_; }
    bool emitSpecular() const { return emitSpecular_; }
    const std::string &imageFile() const { return imageFile_; }
    /// iblPhotonEnergy x 110000, computed in 64 bits and saturated at the int32 maximum (the
    /// settings themselves are never changed).
    int64_t photonEnergy() const { return photonEnergy_; }

private:
    uint32_t subLights_;
    float intensity_, bandingVsNoise_, turnDome_, specularBoost_;
    bool swapYZ_, emitSpecular_;
    std::string imageFile_;
    int64_t photonEnergy_;
};

/// Sub-light count of the image-based light for a sample count.
uint32_t iblSubLightCount(int32_t samples);
/// iblPhotonEnergy x 110000 in 64 bits, saturated to [INT32_MIN, INT32_MAX].
int64_t iblScaledPhotonEnergy(int32_t energy);

/// Makes the light of a scene light by its type: null (after the message) for an unknown type.
/// castShadows receives the CastShadows flag (environment lights are added differently).
std::unique_ptr<LightSource> createLight(const LightParameters &p, bool &castShadows);

/// Makes the image-based light; null (with the error "Error reading IBL lightprobe") when the
/// probe image cannot be read.
std::unique_ptr<KDHDRLight> createImageBasedLight(const EnvironmentValues &values);

}  // namespace ox
