#include "shading/environment.h"

#include <cmath>
#include <cstdio>

#include "platform/file_system.h"

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
                                                      std::string &error) {
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
            return add(std::make_unique<IBLEnvironmentShader>(name, values.iblImageFile,
                                                              values.iblTurnDome, values.iblSwapYZ,
                                                              values.iblGIEnvBlur));
        }
        default:
            // "None", "Camera" and unknown values: rays leaving the scene see black.
            return nullptr;
    }
}

bool Environment::create(const EnvironmentValues &values, std::string &error) {
    error.clear();
    rt_ = select(values.rtEnvironment, values, error);
    if (!error.empty()) return false;
    gi_ = select(values.giEnvironment, values, error);
    return error.empty();
}

}  // namespace ox
