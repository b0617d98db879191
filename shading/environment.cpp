#include "shading/environment.h"

#include <cmath>
#include <cstdio>

#include "platform/file_system.h"
#include "shading/shading_context.h"

namespace ox {
namespace {

Color gammaColor(const Color &c, float gamma) {
    if (gamma == 1.0f || !(gamma > 0.0f)) return c;
    const float e = 1.0f / gamma;
    return {std::pow(std::fmax(c.r, 0.0f), e), std::pow(std::fmax(c.g, 0.0f), e),
            std::pow(std::fmax(c.b, 0.0f), e), c.a};
}

}  // namespace

std::string colorText(const Color &c) {
    char buf[128];
    std::snprintf(buf, sizeof buf, "(%.4f, %.4f, %.4f, %.4f)", c.r, c.g, c.b, c.a);
    return buf;
}

ConstantEnvironmentShader::ConstantEnvironmentShader(std::string name, const Color &color,
                                                     float gamma)
    : EnvironmentShaderInterface(std::move(name)), color_(gammaColor(color, gamma)) {}

GradientEnvironmentShader::GradientEnvironmentShader(std::string name, const Color &upper,
                                                     const Color &lower, float intensity,
                                                     float gamma)
    : EnvironmentShaderInterface(std::move(name)),
      upper_(gammaColor(upper, gamma)),
      lower_(gammaColor(lower, gamma)) {
    for (Color *c : {&upper_, &lower_}) c->r *= intensity, c->g *= intensity, c->b *= intensity;
}

Color GradientEnvironmentShader::evaluateDirection(const Vec3 &d) const {
    const float a = (0.5f * d.y + 0.5f) * (0.5f * d.y + 0.5f);
    const float b = (0.5f - 0.5f * d.y) * (0.5f - 0.5f * d.y);
    return upper_ * a + lower_ * b;
}

IBLEnvironmentShader::IBLEnvironmentShader(std::string name, std::string imageFile,
                                           float turnDomeDegrees, bool swapYZ, float giBlur)
    : EnvironmentShaderInterface(std::move(name)),
      imageFile_(std::move(imageFile)),
      rotation_(turnDomeDegrees * 0.017453292519943295f),
      swapYZ_(swapYZ),
      giBlur_(giBlur) {}

Vec2 probeUV(const Vec3 &direction, float rotation, bool swapYZ) {
    constexpr float kPi = 3.14159265358979f;
    Vec3 d = direction.normalized();
    if (swapYZ) std::swap(d.y, d.z);
    const float y = d.y > 1.0f ? 1.0f : (d.y < -1.0f ? -1.0f : d.y);
    float u = (std::atan2(d.z, d.x) - rotation) * (0.5f / kPi);
    u -= std::floor(u);
    if (!(u >= 0.0f && u < 1.0f)) u = 0.0f;  // NaN directions and rounding up to 1
    const float v = 0.5f + std::asin(y) / kPi;
    return {u, std::isfinite(v) ? v : 0.5f};
}

Color IBLEnvironmentShader::evaluateDirection(const Vec3 &direction) const {
    if (!probe_) return Color(0, 0, 0, 1);
    const Vec2 uv = probeUV(direction, rotation_, swapYZ_);
    const Color c = probe_->lookup(TextureLookup{uv.x, uv.y, 0, 0, 0, 0});
    return std::isfinite(c.r + c.g + c.b + c.a) ? c : Color(0, 0, 0, 1);
}

Color IBLEnvironmentShader::evaluate(const ShadingContext &ctx) const {
    if (!probe_) return Color(0, 0, 0, 1) * ctx.colorWeight;
    const Vec2 uv = probeUV(ctx.rayDirection, rotation_, swapYZ_);
    const float blur = ctx.isGIRay() && giBlur_ > 0.0f ? giBlur_ : 0.0f;
    const Color c = probe_->lookup(TextureLookup{uv.x, uv.y, blur, 0.0f, 0.0f, blur});
    // Float probes may hold NaN or infinite texels: they read as black.
    if (!std::isfinite(c.r + c.g + c.b + c.a)) return Color(0, 0, 0, 1) * ctx.colorWeight;
    return c * ctx.colorWeight;
}

const EnvironmentShaderInterface *Environment::find(const std::string &name) const {
    std::lock_guard lock(mutex_);
    auto it = shaders_.find(name);
    return it == shaders_.end() ? nullptr : it->second.get();
}

const EnvironmentShaderInterface *Environment::add(
    std::unique_ptr<EnvironmentShaderInterface> shader) {
    if (!shader) return nullptr;
    std::lock_guard lock(mutex_);
    auto [it, added] = shaders_.try_emplace(shader->name(), std::move(shader));
    return it->second.get();
}

size_t Environment::size() const {
    std::lock_guard lock(mutex_);
    return shaders_.size();
}

const EnvironmentShaderInterface *Environment::select(int32_t kind, const EnvironmentValues &values,
                                                      std::string &error,
                                                      TextureFactory *textures) {
    switch (static_cast<EnvironmentKind>(kind)) {
        case EnvironmentKind::kSkyLight: {
            std::string name = "ConstantEnvShader(" + colorText(values.skyLightColor) + ")";
            if (auto *s = find(name)) return s;
            return add(std::make_unique<ConstantEnvironmentShader>(name, values.skyLightColor));
        }
        case EnvironmentKind::kIBL: {
            std::string name = "IBLEnv_" + values.iblImageFile;
            if (auto *s = find(name)) return s;
            if (!FileSystemUtilities::canRead(values.iblImageFile)) {
                error = "Cannot read the IBL image " + values.iblImageFile;
                return nullptr;
            }
            auto shader = std::make_unique<IBLEnvironmentShader>(
                name, values.iblImageFile, values.iblTurnDome, values.iblSwapYZ,
                values.iblGIEnvBlur);
            if (textures) {
                std::unique_ptr<OXTexture> probe =
                    textures->getTexture(values.iblImageFile, kFilterMipMap);
                if (!probe) {
                    error = "Cannot read the IBL image " + values.iblImageFile;
                    return nullptr;
                }
                shader->setProbe(std::move(probe));
            }
            return add(std::move(shader));
        }
        default:
            // "None", "Camera" and unknown values: rays leaving the scene see black.
            return nullptr;
    }
}

bool Environment::create(const EnvironmentValues &values, std::string &error,
                         TextureFactory *textures) {
    error.clear();
    rt_ = select(values.rtEnvironment, values, error, textures);
    if (!error.empty()) return false;
    gi_ = select(values.giEnvironment, values, error, textures);
    return error.empty();
}

}  // namespace ox
