#pragma once

#include <cstdint>
#include <utility>
#include <vector>

#include "core/types.h"

namespace ox {

/// Motion-blur state of a run: the mode, the number of motion steps over the shutter interval and
/// an optional list of per-step placements that applies to every moving instance.
class MotionBlurHandler {
public:
    /// Motion-blur modes as the render settings number them.
    enum Mode : int { kOff = 0, k2D = 1, k3D = 2 };
    /// Largest number of motion steps kept (more are clamped with a warning).
    static constexpr uint32_t kMaxSteps = 1024;

    MotionBlurHandler() = default;
    /// motionSteps below 1 is taken as 1; above kMaxSteps it is clamped with a warning.
    MotionBlurHandler(int mode, int64_t motionSteps, float shutterOpen = 1.0f,
                      float shutterClose = 1.0f);

    /// The motion-blur mode (kOff for any unknown value).
    Mode mode() const { return mode_; }
    /// True when geometry moves in 3D (moving triangles are built).
    bool threeD() const { return mode_ == k3D; }
    /// Number of motion steps N (at least 1); geometry is given at N + 1 positions.
    uint32_t steps() const { return steps_; }
    /// Length of one step in shutter time (1 / N).
    float stepLength() const { return 1.0f / float(steps_); }
    float shutterOpen() const { return shutterOpen_; }
    float shutterClose() const { return shutterClose_; }

    /// Sets the handler's own per-step placements (N + 1 entries expected; others are clamped).
    void setStepTransforms(std::vector<Mtx4> transforms) {
        stepTransforms_ = std::move(transforms);
    }
    /// The handler's own per-step placements.
    const std::vector<Mtx4> &stepTransforms() const { return stepTransforms_; }

    /// An instance moves when its MotionBlur flag is set and it has per-step placements, its
    /// shape deforms, or the handler's own list is not empty.
    bool instanceMoves(uint32_t flags, bool hasStepTransforms, bool deforms) const;

    /// The ray time clamped to [0, 1] (NaN becomes 0).
    static float clampTime(float tau);
    /// Step index k = min(floor(N tau), N - 1) and the fraction w inside the step.
    void stepOf(float tau, uint32_t &k, float &w) const { stepOf(steps_, tau, k, w); }
    /// The same for an explicit step count.
    static void stepOf(uint32_t steps, float tau, uint32_t &k, float &w);

    /// World-space motion of a hit: the point with the hit's barycentrics at step N minus the
    /// one at step 0.
    class MotionVectorExtractor {
    public:
        /// corners: (steps + 1) * 3 positions, step-major.
        static Vec3 extract(const Vec3 *corners, uint32_t steps, float u, float v);
    };

private:
    Mode mode_ = kOff;
    uint32_t steps_ = 1;
    float shutterOpen_ = 1.0f, shutterClose_ = 1.0f;
    std::vector<Mtx4> stepTransforms_;
};

/// Position of a hit on a moving triangle at shutter time tau.
class MotionHitInterpolator {
public:
    /// corners: (steps + 1) * 3 positions, step-major; u, v: the hit's barycentrics.
    static Vec3 interpolate(const Vec3 *corners, uint32_t steps, float tau, float u, float v);
    /// The three corners of the triangle at time tau.
    static void cornersAt(const Vec3 *corners, uint32_t steps, float tau, Vec3 out[3]);
};

}  // namespace ox
