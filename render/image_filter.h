#pragma once

#include <cmath>
#include <cstdint>

/// The reconstruction kernels of the image sampler: functions of one offset x that vanish
/// outside [-2, 2). A filter of width w (pixels) evaluates its kernel at x = 4 * dx / w for a
/// sample dx pixels from the pixel centre, so its support is the w pixels around the centre.
namespace ox {

/// The filter types in the order of the FilterType settings enumeration.
enum class FilterKind : int32_t {
    kBox = 0,
    kTriangle = 1,
    kCubic = 2,
    kGauss = 3,
    kCatmullRom = 4,
    kLanczos = 5,
    kMitchell = 6,
    kTavik = 7,
};

/// The Mitchell-Netravali parameters of the "Mitchell" kernel (the usual B = C = 1/3).
constexpr float kMitchellB = 1.0f / 3.0f;
constexpr float kMitchellC = 1.0f / 3.0f;

/// The kernel of kind at x; 0 for x < -2 and x >= 2.
inline float filterKernel(FilterKind kind, float x) {
    if (!(x >= -2.0f && x < 2.0f)) return 0.0f;
    switch (kind) {
        case FilterKind::kBox:
            return 1.0f;
        case FilterKind::kTriangle:
            return 1.0f - std::fabs(x) * 0.5f;
        case FilterKind::kCubic:
            if (x < -1.0f) return (x + 2.0f) * (x + 2.0f) * (x + 2.0f) / 6.0f;
            if (x < 0.0f) return (-3.0f * x * x * x - 6.0f * x * x + 4.0f) / 6.0f;
            if (x < 1.0f) return (3.0f * x * x * x - 6.0f * x * x + 4.0f) / 6.0f;
            return (2.0f - x) * (2.0f - x) * (2.0f - x) / 6.0f;
        case FilterKind::kGauss:
            return std::exp(-x * x);
        case FilterKind::kCatmullRom:
            if (x < -1.0f) return 0.5f * (x * x * x + 5.0f * x * x + 8.0f * x + 4.0f);
            if (x < 0.0f) return 0.5f * (-3.0f * x * x * x - 5.0f * x * x + 2.0f);
            if (x < 1.0f) return 0.5f * (3.0f * x * x * x - 5.0f * x * x + 2.0f);
            return 0.5f * (-x * x * x + 5.0f * x * x - 8.0f * x + 4.0f);
        case FilterKind::kLanczos:
            if (x == 0.0f) return 1.0f;
            return std::sin(1.099525f * x) * std::sin(6.283f * 0.35f * x) /
                   (19.738045f * 0.35f * 0.35f * x * x);
        case FilterKind::kMitchell: {
            const float a = std::fabs(x);
            const float b = kMitchellB, c = kMitchellC;
            if (a < 1.0f)
                return ((12.0f - 9.0f * b - 6.0f * c) * a * a * a +
                        (-18.0f + 12.0f * b + 6.0f * c) * a * a + (6.0f - 2.0f * b)) /
                       6.0f;
            return ((-b - 6.0f * c) * a * a * a + (6.0f * b + 30.0f * c) * a * a +
                    (-12.0f * b - 48.0f * c) * a + (8.0f * b + 24.0f * c)) /
                   6.0f;
        }
        case FilterKind::kTavik:
            return std::fabs(x) * 0.5f;
    }
    return 0.0f;
}

/// The name of a filter kind as the settings spell it ("Box", "Triangle", ...).
const char *filterName(FilterKind kind);

}  // namespace ox
