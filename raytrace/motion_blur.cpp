#include "raytrace/motion_blur.h"

#include <cmath>

#include "core/message.h"

namespace ox {

MotionBlurHandler::MotionBlurHandler(int mode, int64_t motionSteps, float shutterOpen,
                                     float shutterClose)
    : shutterOpen_(shutterOpen), shutterClose_(shutterClose) {
    mode_ = (mode == k2D || mode == k3D) ? Mode(mode) : kOff;
    if (motionSteps < 1) {
        steps_ = 1;
    } else if (motionSteps > int64_t(kMaxSteps)) {
        message(kMsgWarning, 5, "Motion steps %lld clamped to %u", (long long)motionSteps,
                kMaxSteps);
        steps_ = kMaxSteps;
    } else {
        steps_ = uint32_t(motionSteps);
    }
}

bool MotionBlurHandler::instanceMoves(uint32_t flags, bool hasStepTransforms, bool deforms) const {
    return (flags & 0x8u) != 0 && (hasStepTransforms || deforms || !stepTransforms_.empty());
}

float MotionBlurHandler::clampTime(float tau) {
    if (std::isnan(tau)) return 0.0f;
    return std::fmin(std::fmax(tau, 0.0f), 1.0f);
}

void MotionBlurHandler::stepOf(uint32_t steps, float tau, uint32_t &k, float &w) {
    if (steps < 1) steps = 1;
    tau = clampTime(tau);
    float n = float(steps);
    float fk = std::floor(n * tau);
    k = fk >= n - 1.0f ? steps - 1 : uint32_t(fk);
    float delta = 1.0f / n;
    float a = float(k) * delta, b = float(k + 1) * delta;
    w = (tau - a) / (b - a);
}

void MotionHitInterpolator::cornersAt(const Vec3 *corners, uint32_t steps, float tau, Vec3 out[3]) {
    uint32_t k;
    float w;
    MotionBlurHandler::stepOf(steps, tau, k, w);
    for (int c = 0; c < 3; ++c) {
        const Vec3 &a = corners[k * 3 + c];
        const Vec3 &b = corners[(k + 1) * 3 + c];
        out[c] = a + (b - a) * w;
    }
}

Vec3 MotionHitInterpolator::interpolate(const Vec3 *corners, uint32_t steps, float tau, float u,
                                        float v) {
    Vec3 p[3];
    cornersAt(corners, steps, tau, p);
    return p[0] * (1.0f - u - v) + p[1] * u + p[2] * v;
}

Vec3 MotionBlurHandler::MotionVectorExtractor::extract(const Vec3 *corners, uint32_t steps, float u,
                                                       float v) {
    if (steps < 1) steps = 1;
    auto at = [&](uint32_t k) {
        const Vec3 *p = corners + k * 3;
        return p[0] * (1.0f - u - v) + p[1] * u + p[2] * v;
    };
    return at(steps) - at(0);
}

}  // namespace ox
