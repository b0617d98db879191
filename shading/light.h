#pragma once

#include <cmath>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "core/types.h"
#include "raytrace/ray.h"
#include "shading/environment.h"
#include "shading/light_context.h"
#include "shading/shadow_sampler.h"

namespace ox {

class TextureFactory;

/// The distance attenuation models of the scene ("STANDARD" 0, "UNREAL" 1).
enum class AttenuationType : int32_t { kStandard = 0, kUnreal = 1 };

/// Largest factor an attenuation returns: keeps exponents and tiny distances finite.
constexpr float kMaxAttenuation = 1e30f;

/// Distance falloff of a light. Every model returns a finite factor in [0, 1e30] for any
/// distance (distances below 1e-6, and NaN, count as 1e-6).
class AttenuationSettings {
public:
    /// A non-finite exponent counts as 0.
    explicit AttenuationSettings(float exponent)
        : exponent_(std::isfinite(exponent) ? exponent : 0.0f) {}
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

/// t ^ exponent with t = 1 - (d / radius)^2: zero where t <= 0 (at and beyond the radius) and
/// for a radius <= 0.
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
    LightType type = LightType::kPoint;
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
    AttenuationType attenuationType = AttenuationType::kStandard;
    Mtx4 objectToWorld;
};

/// Light flag bits (the shading component bits a light feeds).
constexpr uint32_t kLightDiffuse = 0x1, kLightSpecular = 0x2, kLightAmbient = 0x4,
                   kLightShadows = 0x40, kLightIndirect = 0x100;

/// Luminance below which a light is too weak to matter at a point: no shadow rays are traced.
constexpr float kLightCutLuminance = 0.0005f;

/// A light of the scene: name, flags, world box of its influence, intensity scale per ray type,
/// photon emission, and the operations shading asks of every light.
///
/// Calling convention of the operations: p is the shaded point in world space, n its unit
/// shading normal; ctx belongs to the calling thread (its generator, ray counter, ray type and
/// depth) and the lights change nothing else, so any number of threads may call them at once.
/// No operation allocates or locks. A shading loop typically calls `illuminate` with shadows,
/// skips the light when the luminance is tiny, and weights diffuse light by
/// max(0, `cosineFactor`) and specular light by `directionToLight`.
class LightSource {
public:
    explicit LightSource(std::string name);
    virtual ~LightSource() = default;
    LightSource(const LightSource &) = delete;
    LightSource &operator=(const LightSource &) = delete;

    /// Light arriving at p: the colour with attenuation, ramp, cone, gobo and the light's scale
    /// for ctx.rayType; times `shadowTransmission` (importance 1) when withShadow is true.
    virtual Color illuminate(const Vec3 &p, const Vec3 &n, LightContext &ctx,
                             bool withShadow) const = 0;
    /// The part of the light that reaches p past the scene's geometry: white unless the context
    /// allows shadows and the light casts them (flag 0x40). importance in [0, 1] scales the
    /// number of shadow rays by its square root.
    virtual Color shadowTransmission(const Vec3 &p, LightContext &ctx, float importance) const;
    /// Cosine between the normal and the direction towards the light (1 for lights without a
    /// direction, which fold any cosine into `illuminate`).
    virtual float cosineFactor(const Vec3 &p, const Vec3 &n) const {
        return dot(directionToLight(p), n);
    }
    /// Unit direction from p towards the light; the zero vector at the light's own position.
    virtual Vec3 directionToLight(const Vec3 &p) const = 0;
    /// Unit direction from p towards the nearest point of the light's emitting surface: the
    /// same as `directionToLight` for point-like lights (point, spot, directional, ambient,
    /// albedo); an area light points at the nearest point of its rectangle. Zero on the light.
    virtual Vec3 directionToLightSurface(const Vec3 &p) const { return directionToLight(p); }
    /// Distance from p to the light's position; -1 for lights without a position.
    virtual float distanceTo(const Vec3 &) const { return -1.0f; }
    /// Radiance a camera sees on the light itself (black for every light).
    virtual Color visibleRadiance() const { return Color::black(); }
    /// Both answers at once: unshadowed = `illuminate` without shadow; shadowed = the same with
    /// R, G and B (not alpha) multiplied by `shadowTransmission` at importance 1.
    virtual void illuminateBoth(Color &shadowed, Color &unshadowed, const Vec3 &p, const Vec3 &n,
                                LightContext &ctx) const;
    /// False where the light certainly contributes nothing (true by default).
    virtual bool affectsPoint(const Vec3 &) const { return true; }

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
    /// True when a shadow query must ask the sampler: the context allows shadows and the light
    /// casts them.
    bool castsShadowsFor(const LightContext &ctx) const {
        return ctx.allowShadows && hasFlag(kLightShadows);
    }

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
    /// Attenuation at distance d, d raised to at least the scene's ray bias (1 without a model).
    float attenuationAt(float d, const LightContext &ctx) const {
        return attenuation_ ? attenuation_->attenuate(std::fmax(d, ctx.bias())) : 1.0f;
    }

    Color color_;
    Mtx4 objectToWorld_;
    Mtx4 worldToLight_;
    std::unique_ptr<AttenuationSettings> attenuation_;
    ShadowSamplerSettings shadow_;
};

/// A point light at the placement's origin, with an optional colour ramp over the light's unit
/// sphere (in light space).
class SimplePointLight : public SimpleLightSourceBase {
public:
    explicit SimplePointLight(const LightParameters &p);
    const char *className() const override { return "SimplePointLight"; }
    Color illuminate(const Vec3 &p, const Vec3 &n, LightContext &ctx,
                     bool withShadow) const override;
    Color shadowTransmission(const Vec3 &p, LightContext &ctx, float importance) const override;
    Vec3 directionToLight(const Vec3 &p) const override { return (position_ - p).normalized(); }
    float distanceTo(const Vec3 &p) const override { return (position_ - p).length(); }
    /// Without a ramp: closer than DecayCutoff; with a ramp: inside the light's unit sphere.
    bool affectsPoint(const Vec3 &p) const override;

    const Vec3 &position() const { return position_; }
    const LightRamp &ramp() const { return ramp_; }
    /// DecayCutoff squared.
    float cutoffSquared() const { return cutoff2_; }

protected:
    /// Colour x ramp x attenuation x scale at p (black when too weak); shared with spot lights.
    Color unshadowed(const Vec3 &p, const LightContext &ctx) const;

    Vec3 position_;
    LightRamp ramp_;
    float cutoff2_;
};

/// A spot light: a point light with a cone along the light's -y axis, a penumbra and an optional
/// gobo (a texture projected over the cone).
class SimpleSpotLight : public SimplePointLight {
public:
    explicit SimpleSpotLight(const LightParameters &p);
    const char *className() const override { return "SimpleSpotLight"; }
    Color illuminate(const Vec3 &p, const Vec3 &n, LightContext &ctx,
                     bool withShadow) const override;

    /// Cone falloff for the cosine c between the axis and the direction to the point: 0 outside
    /// the outer cone, 1 inside the inner cone, (1 - (c - cos inner) / (cos outer - cos inner))
    /// ^ exponent between.
    float coneFalloff(float c) const;
    /// The gobo's texture coordinates of the unit direction d from the light: the cone spans
    /// [0, 1]^2 around (0.5, 0.5); false behind the light.
    bool goboCoordinates(const Vec3 &d, float &u, float &v) const;
    /// Attaches the gobo texture (shared, read-only); null removes it.
    void setGoboTexture(std::shared_ptr<const TextureLookupInterface> texture) {
        gobo_ = std::move(texture);
    }

    const Vec3 &axis() const { return axis_; }
    float cosOuter() const { return cosOuter_; }
    float cosInner() const { return cosInner_; }
    float penumbraExponent() const { return penumbraExponent_; }
    /// True when a gobo texture is attached.
    bool hasGobo() const { return gobo_ != nullptr; }
    /// The readable gobo file named by the scene (empty when none or unreadable).
    const std::string &goboFile() const { return goboFile_; }
    const Vec3 &goboU() const { return goboU_; }
    const Vec3 &goboV() const { return goboV_; }
    float goboScale() const { return goboScale_; }

private:
    Vec3 axis_;
    float cosOuter_, cosInner_, penumbraExponent_;
    std::shared_ptr<const TextureLookupInterface> gobo_;
    std::string goboFile_;
    Vec3 goboU_, goboV_;
    float goboScale_ = 0.0f;
};

/// A directional light: parallel light from the direction the placement turns (0, -1, 0) to.
class SimpleDirectionalLight : public SimpleLightSourceBase {
public:
    explicit SimpleDirectionalLight(const LightParameters &p);
    const char *className() const override { return "SimpleDirectionalLight"; }
    Color illuminate(const Vec3 &p, const Vec3 &n, LightContext &ctx,
                     bool withShadow) const override;
    Color shadowTransmission(const Vec3 &p, LightContext &ctx, float importance) const override;
    Vec3 directionToLight(const Vec3 &) const override { return direction_; }
    /// Unit vector towards the light.
    const Vec3 &direction() const { return direction_; }

private:
    Vec3 direction_;
};

/// An area light: the square -1..1 in the light's x-y plane, lighting the +z side. The shadow
/// sampler integrates over the rectangle; attenuation uses the distance to the centre (at most
/// 1 with ClampToIntensity).
class SimpleAreaLight : public SimpleLightSourceBase {
public:
    explicit SimpleAreaLight(const LightParameters &p);
    const char *className() const override { return "SimpleAreaLight"; }
    Color illuminate(const Vec3 &p, const Vec3 &n, LightContext &ctx,
                     bool withShadow) const override;
    Color shadowTransmission(const Vec3 &p, LightContext &ctx, float importance) const override;
    /// The mean of max(0, cos) over the light's rectangle as seen from p (exact, by clipping the
    /// rectangle to the hemisphere of n and integrating over its edges).
    float cosineFactor(const Vec3 &p, const Vec3 &n) const override;
    Vec3 directionToLight(const Vec3 &p) const override { return (center_ - p).normalized(); }
    Vec3 directionToLightSurface(const Vec3 &p) const override;
    float distanceTo(const Vec3 &p) const override { return (center_ - p).length(); }
    /// In front of the light and closer to its centre than DecayCutoff.
    bool affectsPoint(const Vec3 &p) const override;

    const Vec3 &center() const { return center_; }
    const Vec3 &normal() const { return normal_; }
    /// True when the light never gets brighter than its colour: the attenuation near the light
    /// is clamped to 1 whatever the attenuation model.
    bool clampToIntensity() const { return clampToIntensity_; }
    /// The four corners in world space.
    const Vec3 *corners() const { return corners_; }

protected:
    Vec3 center_, normal_;
    Vec3 corners_[4];
    bool clampToIntensity_;
    float cutoff2_;
};

/// A window light: an area light whose light passes the window as directional light along the
/// window's normal, spread over the window's half opening angle; shadow rays leave through the
/// window's rectangle (anything else is wall).
class SimpleWindowLight : public SimpleAreaLight {
public:
    explicit SimpleWindowLight(const LightParameters &p);
    const char *className() const override { return "SimpleWindowLight"; }
    Color shadowTransmission(const Vec3 &p, LightContext &ctx, float importance) const override;
    float cosineFactor(const Vec3 &p, const Vec3 &n) const override {
        return dot(directionToLight(p), n);
    }
    Vec3 directionToLight(const Vec3 &) const override { return -normal_; }
    Vec3 directionToLightSurface(const Vec3 &) const override { return -normal_; }
    /// Half opening angle in radians.
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
    Color illuminate(const Vec3 &p, const Vec3 &n, LightContext &ctx,
                     bool withShadow) const override;
    float cosineFactor(const Vec3 &, const Vec3 &) const override { return 1.0f; }
    Vec3 directionToLight(const Vec3 &) const override { return Vec3(0, 1, 0); }
    const Color &color() const { return color_; }

private:
    Color color_;
};

/// A light from an environment shader (owned): `illuminate` is the cosine-weighted mean of the
/// environment over the hemisphere of the normal (irradiance / pi), so its cosine factor is 1.
/// With shadows every direction traces an occlusion ray.
class EnvironmentLight : public LightSource {
public:
    EnvironmentLight(std::string name, std::unique_ptr<EnvironmentShaderInterface> shader,
                     bool castShadows);
    const char *className() const override { return "EnvironmentLight"; }
    Color illuminate(const Vec3 &p, const Vec3 &n, LightContext &ctx,
                     bool withShadow) const override;
    void illuminateBoth(Color &shadowed, Color &unshadowed, const Vec3 &p, const Vec3 &n,
                        LightContext &ctx) const override;
    float cosineFactor(const Vec3 &, const Vec3 &) const override { return 1.0f; }
    Vec3 directionToLight(const Vec3 &) const override { return Vec3(0, 1, 0); }
    const EnvironmentShaderInterface &shader() const { return *shader_; }

    /// Directions of the hemisphere integration without shadows (a fixed n x n layout).
    static constexpr int kQuadratureSide = 8;
    /// Sample count of the shadowed integration at importance 1.
    static constexpr uint32_t kShadowSamples = 64;

private:
    std::unique_ptr<EnvironmentShaderInterface> shader_;
};

/// A constant white light for albedo passes: direction (0, 0, 1), cosine factor 1.
class AlbedoLight : public LightSource {
public:
    AlbedoLight() : LightSource("AlbedoLight") { flags_ = kLightDiffuse; }
    const char *className() const override { return "AlbedoLight"; }
    Color illuminate(const Vec3 &, const Vec3 &, LightContext &, bool) const override {
        return Color::white();
    }
    float cosineFactor(const Vec3 &, const Vec3 &) const override { return 1.0f; }
    Vec3 directionToLight(const Vec3 &) const override { return Vec3(0, 0, 1); }
};

/// A light probe as plain floats: width x height RGBA texels, row by row, row 0 at the bottom
/// (the -y pole); column u spans the longitude (see `probeDirection`).
struct LightProbeImage {
    int32_t width = 0, height = 0;
    std::vector<Color> texels;
    bool valid() const {
        return width > 0 && height > 0 && texels.size() == size_t(width) * size_t(height);
    }
    const Color &at(int32_t x, int32_t y) const { return texels[size_t(y) * size_t(width) + x]; }
};

/// The unit direction of probe coordinates (u, v) in [0, 1]^2 (latitude-longitude layout):
/// v = 0 points down (-y), v = 1 up (+y); u turns about y from +x (u = 0) over +z (u = 0.25).
Vec3 probeDirection(float u, float v);

/// One directional sub-light of the image-based light: the energy centre of a probe region.
struct IBLSubLight {
    Vec3 direction;         ///< Unit direction towards the region (after turning and swapping).
    Color color;            ///< Sum of radiance x solid angle over the region, / (2 pi^2).
    Vec3 spreadU, spreadV;  ///< Half extents of the region across the direction (for jitter).
};

class KDSpecularSubLight;

/// The image-based light of the environment settings: the probe split into sub-lights of about
/// equal energy. `illuminate` sums the sub-lights over the hemisphere of the normal (cosines
/// included, so its cosine factor is 1); a constant probe of radiance L gives L on every
/// upward normal, like the environment light. With shadows each sub-light traces one ray.
class KDHDRLight : public LightSource {
public:
    explicit KDHDRLight(const EnvironmentValues &values);
    ~KDHDRLight() override;
    const char *className() const override { return "KDHDRLight"; }
    Color illuminate(const Vec3 &p, const Vec3 &n, LightContext &ctx,
                     bool withShadow) const override;
    void illuminateBoth(Color &shadowed, Color &unshadowed, const Vec3 &p, const Vec3 &n,
                        LightContext &ctx) const override;
    float cosineFactor(const Vec3 &, const Vec3 &) const override { return 1.0f; }
    /// The direction of the brightest sub-light ((0, 1, 0) without sub-lights).
    Vec3 directionToLight(const Vec3 &) const override { return mainDirection_; }

    /// Splits the probe into at most subLightCount() regions by recursive halving of their
    /// weighted energy (rows weighted by sin(pi (row + 0.5) / rows)), one sub-light each.
    /// False (nothing changes) for an empty or inconsistent image.
    bool buildSubLights(const LightProbeImage &probe);
    const std::vector<IBLSubLight> &subLights() const { return lights_; }
    /// The specular sub-lights (one per sub-light, colour x iblSpecularBoost), for the scene to
    /// add as lights of their own; specular only when this light emits diffuse light.
    std::vector<std::unique_ptr<KDSpecularSubLight>> makeSpecularSubLights() const;

    /// 2^k sub-lights for the smallest k with 2^k >= iblSamples, at most 65536.
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
    Color sum(const Vec3 &p, const Vec3 &n, LightContext &ctx, bool withShadow) const;

    uint32_t subLights_;
    float intensity_, bandingVsNoise_, turnDome_, specularBoost_;
    bool swapYZ_, emitSpecular_;
    std::string imageFile_;
    int64_t photonEnergy_;
    std::vector<IBLSubLight> lights_;
    Vec3 mainDirection_{0, 1, 0};
};

/// A specular sub-light of the image-based light ("SpecularSublight"): a directional light that
/// feeds diffuse, specular and ambient shading and casts shadows as the image light does.
class KDSpecularSubLight : public LightSource {
public:
    /// specularOnly: the sub-light feeds specular shading only (the image light emits the
    /// diffuse part itself).
    KDSpecularSubLight(const Vec3 &direction, const Color &color, bool shadows,
                       bool specularOnly = false);
    const char *className() const override { return "KDSpecularSubLight"; }
    Color illuminate(const Vec3 &p, const Vec3 &n, LightContext &ctx,
                     bool withShadow) const override;
    Color shadowTransmission(const Vec3 &p, LightContext &ctx, float importance) const override;
    Vec3 directionToLight(const Vec3 &) const override { return direction_; }
    const Color &color() const { return color_; }

private:
    Vec3 direction_;
    Color color_;
    ShadowSamplerSettings shadow_;
};

/// Sub-light count of the image-based light for a sample count (at most 65536).
uint32_t iblSubLightCount(int32_t samples);
/// iblPhotonEnergy x 110000 in 64 bits, saturated to [INT32_MIN, INT32_MAX].
int64_t iblScaledPhotonEnergy(int32_t energy);

/// Makes the light of a scene light by its type: null (after the message) for an unknown type.
/// castShadows receives the CastShadows flag (environment lights are added differently).
std::unique_ptr<LightSource> createLight(const LightParameters &p, bool &castShadows);

/// Widest probe the image-based light splits: larger probes are read from the first mip level
/// at most this wide and high (the levels keep the mean, so the energy is the same).
constexpr int32_t kMaxLightProbeSide = 2048;

/// Reads a light probe through the texture manager into plain floats (rows from the bottom);
/// false (after the texture manager's message) when the file cannot be read.
bool readLightProbe(TextureFactory &textures, const std::string &file, LightProbeImage &out,
                    int32_t maxSide = kMaxLightProbeSide);

/// Makes the image-based light with its sub-lights from the probe file iblImageFile; null (with
/// the error "Error reading IBL lightprobe") when the probe cannot be read.
std::unique_ptr<KDHDRLight> createImageBasedLight(const EnvironmentValues &values,
                                                  TextureFactory &textures);

}  // namespace ox
