#include "shading/light.h"

#include <algorithm>
#include <cfloat>
#include <cmath>
#include <numeric>

#include "core/message.h"
#include "platform/file_system.h"

namespace ox {
namespace {

constexpr float kDegToRad = 0.017453292519943295f;
constexpr float kPi = 3.14159265358979f;
constexpr uint32_t kMaxIblSubLights = 65536;

BBox infiniteBox() {
    return BBox(Vec3(-FLT_MAX, -FLT_MAX, -FLT_MAX), Vec3(FLT_MAX, FLT_MAX, FLT_MAX));
}

// Box of a point set grown by r on every axis, computed in double and kept finite.
BBox grownBox(const Vec3 *points, int n, float r) {
    BBox b;
    for (int i = 0; i < n; ++i) b.extend(points[i]);
    auto grow = [r](float v, float sign) {
        double g = double(v) + sign * double(r);
        return static_cast<float>(std::clamp(g, -double(FLT_MAX), double(FLT_MAX)));
    };
    return BBox(Vec3(grow(b.min.x, -1), grow(b.min.y, -1), grow(b.min.z, -1)),
                Vec3(grow(b.max.x, 1), grow(b.max.y, 1), grow(b.max.z, 1)));
}

float checkedCutoff(const LightParameters &p) {
    if (p.decayCutoff >= 0.0f) return std::fmin(p.decayCutoff, FLT_MAX);
    message(kMsgWarning, 6, "Light %s has an invalid DecayCutoff, the light is not cut off",
            p.name.c_str());
    return FLT_MAX;
}

std::unique_ptr<AttenuationSettings> makeAttenuation(const LightParameters &p, float cutoff) {
    if (p.attenuationType == AttenuationType::kUnreal)
        return std::make_unique<UnrealAttenuation>(p.falloffExponent, cutoff);
    if (p.decayClampToOne) return std::make_unique<ClampedStandardAttenuation>(p.falloffExponent);
    return std::make_unique<StandardAttenuation>(p.falloffExponent);
}

ShadowSamplerSettings samplerSettings(const LightParameters &p, ShadowSamplerSettings::Kind kind,
                                      float size) {
    ShadowSamplerSettings s;
    s.kind = kind;
    s.size = size;
    s.samples = static_cast<uint32_t>(std::clamp<int64_t>(p.shadowSamples, 1, kMaxShadowSamples));
    s.minSamples = std::min(p.minShadowSamples, kMaxShadowSamples);
    return s;
}

Color photonPower(const LightParameters &p, float factor) {
    const float k = p.photonIntensity * factor;
    return Color(p.color.r * k, p.color.g * k, p.color.b * k, p.color.a * k);
}

// An angle in radians from degrees, NaN and infinities counted as 0.
float radians(float degrees) { return std::isfinite(degrees) ? degrees * kDegToRad : 0.0f; }

// The distance the standard models see: at least 1e-6, NaN counted as 1e-6.
inline float safeDistance(float d) { return d > 1e-6f ? d : 1e-6f; }
// A factor kept within [0, kMaxAttenuation] (an overflow to infinity becomes the bound).
inline float boundedFactor(float f) { return f < kMaxAttenuation ? f : kMaxAttenuation; }

}  // namespace

float StandardAttenuation::attenuate(float d) const {
    // The common exponents without pow.
    if (exponent_ == 2.0f) return boundedFactor(1.0f / (safeDistance(d) * safeDistance(d)));
    if (exponent_ == 0.0f) return 1.0f;
    return boundedFactor(std::pow(1.0f / safeDistance(d), exponent_));
}

float ClampedStandardAttenuation::attenuate(float d) const {
    if (exponent_ == 2.0f) return std::fmin(1.0f, 1.0f / (safeDistance(d) * safeDistance(d)));
    if (exponent_ == 0.0f) return 1.0f;
    return std::fmin(1.0f, std::pow(1.0f / safeDistance(d), exponent_));
}

float UnrealAttenuation::attenuate(float d) const {
    // pow(0, 0) would be 1: the cut-off must hold for every exponent, and a radius <= 0 has no
    // inside at all.
    if (!(radius_ > 0.0f)) return 0.0f;
    const float q = safeDistance(d) / radius_;
    const float t = 1.0f - q * q;
    if (!(t > 0.0f)) return 0.0f;
    return boundedFactor(std::pow(t, exponent_));
}

LightRamp::LightRamp(const std::vector<RampEntry> &entries) {
    std::vector<size_t> order;
    for (size_t i = 0; i < entries.size(); ++i)
        if (std::isfinite(entries[i].pos)) order.push_back(i);
    std::stable_sort(order.begin(), order.end(),
                     [&](size_t a, size_t b) { return entries[a].pos < entries[b].pos; });
    for (size_t i : order) {
        colors_.emplace_back(entries[i].r, entries[i].g, entries[i].b, 1.0f);
        positions_.push_back(entries[i].pos);
    }
}

Color LightRamp::lookup(float x) const {
    if (colors_.empty()) return Color::white();
    if (x < 0.0f) return colors_.front();
    if (x > 1.0f) return Color::black();
    // The first position not below x (positions are sorted by the constructor).
    const size_t i =
        size_t(std::lower_bound(positions_.begin(), positions_.end(), x) - positions_.begin());
    if (i == 0) return colors_.front();
    if (i == positions_.size()) return colors_.back();
    const float span = positions_[i] - positions_[i - 1];
    if (span < 0.0001f) return colors_[i - 1];
    const float t = (x - positions_[i - 1]) / span;
    return colors_[i - 1] * (1.0f - t) + colors_[i] * t;
}

LightSource::LightSource(std::string name) : name_(std::move(name)) {
    std::fill(std::begin(scales_), std::end(scales_), 1.0f);
}

SimpleLightSourceBase::SimpleLightSourceBase(const LightParameters &p)
    : LightSource(p.name), color_(p.color), objectToWorld_(p.objectToWorld) {
    if (!objectToWorld_.inverse(worldToLight_)) worldToLight_ = Mtx4();
    flags_ = kLightDiffuse | kLightSpecular | (p.castShadows ? kLightShadows : 0u);
    scales_[0] = p.directLightScale;
    scales_[5] = p.indirectLightScale;
    photons_.diffusePhotons = p.diffusePhotons;
    photons_.specularPhotons = p.specularPhotons;
}

SimplePointLight::SimplePointLight(const LightParameters &p)
    : SimpleLightSourceBase(p), ramp_(p.lightRampColors) {
    const float cutoff = checkedCutoff(p);
    position_ = objectToWorld_.transformPoint(Vec3());
    cutoff2_ = cutoff * cutoff;
    bounds_ = grownBox(&position_, 1, cutoff);
    attenuation_ = makeAttenuation(p, cutoff);
    shadow_ = samplerSettings(p, ShadowSamplerSettings::kPoint, p.pointLightShadowRadius);
    photons_.power = photonPower(p, 12.0f);
}

SimpleSpotLight::SimpleSpotLight(const LightParameters &p) : SimplePointLight(p) {
    shadow_ = samplerSettings(p, ShadowSamplerSettings::kPoint, p.spotLightShadowRadius);
    const float half = radians(p.spotLightConeAngle) * 0.5f;
    const float pen = radians(p.spotLightPenumbraAngle);
    float outer = half, inner = half;
    if (pen > 0.0f)
        outer = half + pen;
    else
        inner = half - std::fabs(pen);
    // A cone cannot open wider than all directions, nor an inner cone close below nothing.
    outer = std::clamp(outer, 0.0f, kPi);
    inner = std::clamp(inner, 0.0f, outer);
    cosOuter_ = std::cos(outer);
    cosInner_ = std::cos(inner);
    penumbraExponent_ =
        std::isfinite(p.spotLightPenumbraExponent) ? p.spotLightPenumbraExponent : 0.0f;
    axis_ = objectToWorld_.transformVector(Vec3(0, -1, 0)).normalized();
    goboU_ = objectToWorld_.transformVector(Vec3(1, 0, 0)).normalized();
    goboV_ = objectToWorld_.transformVector(Vec3(0, 0, 1)).normalized();
    // The gobo covers the cone out to its outer angle; a plane cannot hold a cone of 90 degrees
    // or more, so the projection stops at 89 degrees, and a closed cone maps to the centre.
    const float projected = std::min(outer, 89.0f * kDegToRad);
    goboScale_ = projected > 1e-6f ? 1.0f / (2.0f * std::tan(projected)) : 0.0f;
    if (!p.spotLightGoboTexture.empty()) {
        if (FileSystemUtilities::canRead(p.spotLightGoboTexture)) {
            goboFile_ = p.spotLightGoboTexture;
        } else {
            message(kMsgError, 3, "Gobo file %s failed to load", p.spotLightGoboTexture.c_str());
        }
    }
}

SimpleDirectionalLight::SimpleDirectionalLight(const LightParameters &p)
    : SimpleLightSourceBase(p) {
    direction_ = -objectToWorld_.transformVector(Vec3(0, -1, 0)).normalized();
    bounds_ = infiniteBox();
    shadow_ = samplerSettings(p, ShadowSamplerSettings::kDirectional,
                              radians(p.directionalLightShadowAngle));
    photons_.power = photonPower(p, 300.0f);
}

SimpleAreaLight::SimpleAreaLight(const LightParameters &p)
    : SimpleLightSourceBase(p), clampToIntensity_(p.clampToIntensity) {
    const float cutoff = checkedCutoff(p);
    center_ = objectToWorld_.transformPoint(Vec3());
    const Vec3 local[4] = {{-1, -1, 0}, {1, -1, 0}, {1, 1, 0}, {-1, 1, 0}};
    for (int i = 0; i < 4; ++i) corners_[i] = objectToWorld_.transformPoint(local[i]);
    normal_ = cross(objectToWorld_.transformVector(Vec3(1, 0, 0)),
                    objectToWorld_.transformVector(Vec3(0, 1, 0)))
                  .normalized();
    bounds_ = grownBox(corners_, 4, cutoff);
    cutoff2_ = cutoff * cutoff;
    attenuation_ = makeAttenuation(p, cutoff);
    shadow_ = samplerSettings(p, ShadowSamplerSettings::kArea, 0.0f);
    photons_.power = photonPower(p, 12.0f);
}

SimpleWindowLight::SimpleWindowLight(const LightParameters &p) : SimpleAreaLight(p) {
    halfAngle_ = std::clamp(radians(p.directionalLightShadowAngle) * 0.5f, 0.0f, 1.5f);
    tanHalfAngle_ = std::tan(halfAngle_);
    shadow_ = samplerSettings(p, ShadowSamplerSettings::kDirectional, halfAngle_);
    shadow_.clipAtPlane = true;
    if (p.photonIntensity > 0.0f) {
        message(kMsgError, 3, "Photon emission from window lights not supported");
        photons_.power = Color();
    }
}

SimpleAmbientLight::SimpleAmbientLight(std::string name, const Color &color)
    : LightSource(std::move(name)), color_(color) {
    flags_ = kLightAmbient;
    bounds_ = infiniteBox();
}

EnvironmentLight::EnvironmentLight(std::string name,
                                   std::unique_ptr<EnvironmentShaderInterface> shader,
                                   bool castShadows)
    : LightSource(std::move(name)), shader_(std::move(shader)) {
    flags_ = kLightAmbient | (castShadows ? kLightShadows : 0u);
    bounds_ = infiniteBox();
}

uint32_t iblSubLightCount(int32_t samples) {
    for (uint32_t k = 0; (1u << k) < kMaxIblSubLights; ++k)
        if ((int64_t(1) << k) >= int64_t(samples)) return 1u << k;
    return kMaxIblSubLights;
}

int64_t iblScaledPhotonEnergy(int32_t energy) {
    const int64_t v = int64_t(energy) * 110000;
    return std::clamp<int64_t>(v, INT32_MIN, INT32_MAX);
}

KDHDRLight::KDHDRLight(const EnvironmentValues &v)
    : LightSource("KDHDRLight"),
      subLights_(iblSubLightCount(v.iblSamples)),
      intensity_(v.iblIntensity * 6.283185307179586f),
      bandingVsNoise_(v.iblBandingVsNoise),
      turnDome_(v.iblTurnDome * kDegToRad),
      specularBoost_(v.iblSpecularBoost),
      swapYZ_(v.iblSwapYZ),
      emitSpecular_(v.iblEmitSpecular),
      imageFile_(v.iblImageFile),
      photonEnergy_(iblScaledPhotonEnergy(v.iblPhotonEnergy)) {
    setFlag(kLightDiffuse, v.iblEmitDiffuse);
    setFlag(kLightSpecular, false);
    setFlag(kLightShadows, v.iblShadows);
    bounds_ = infiniteBox();
    photons_.diffusePhotons = v.iblEmitPhotons ? v.iblGlobalPhotons : 0;
    photons_.specularPhotons = v.iblEmitPhotons ? v.iblCausticsPhotons : 0;
}

KDHDRLight::~KDHDRLight() = default;

std::unique_ptr<LightSource> createLight(const LightParameters &p, bool &castShadows) {
    castShadows = p.castShadows;
    switch (p.type) {
        case LightType::kPoint:
            return std::make_unique<SimplePointLight>(p);
        case LightType::kDirectional:
            return std::make_unique<SimpleDirectionalLight>(p);
        case LightType::kSpot:
            return std::make_unique<SimpleSpotLight>(p);
        case LightType::kArea:
            return std::make_unique<SimpleAreaLight>(p);
        case LightType::kWindow:
            return std::make_unique<SimpleWindowLight>(p);
        case LightType::kEnvironment:
            return std::make_unique<EnvironmentLight>(
                p.name,
                std::make_unique<GradientEnvironmentShader>(p.name, p.color, p.lowerColor, 1.0f),
                p.castShadows);
    }
    message(kMsgWarning, 6, "Unknown type %d of light %s, the light is skipped", int(p.type),
            p.name.c_str());
    return nullptr;
}

}  // namespace ox
