#include "render/color_correction.h"

#include <cmath>
#include <cstring>

#include "core/message.h"

namespace ox {

void NilColorCorrection::correct(const Color *input, Color *output, size_t n) const {
    if (input != output) std::memmove(output, input, n * sizeof(Color));
}

namespace {

/// Negative and NaN channels become 0 before any power (a fractional power of a negative
/// value is NaN).
inline float clampChannel(float c) { return c > 0.0f ? c : 0.0f; }

}  // namespace

float GammaColorCorrection::gamma(float c, float inverse) {
    c = clampChannel(c);
    return c > 0.0f ? std::pow(c, inverse) : 0.0f;
}

void GammaColorCorrection::correct(const Color *input, Color *output, size_t n) const {
    for (size_t i = 0; i < n; ++i) {
        const Color c = input[i];
        output[i] = Color(gamma(c.r, inverse_), gamma(c.g, inverse_), gamma(c.b, inverse_), c.a);
    }
}

float SRGBColorCorrection::toSRGB(float c) {
    c = clampChannel(c);
    return c <= 0.0031308f ? 12.92f * c : 1.055f * std::pow(c, 0.41666666f) - 0.055f;
}

void SRGBColorCorrection::correct(const Color *input, Color *output, size_t n) const {
    for (size_t i = 0; i < n; ++i) {
        const Color c = input[i];
        output[i] = Color(toSRGB(c.r), toSRGB(c.g), toSRGB(c.b), c.a);
    }
}

std::unique_ptr<ColorCorrectionInterface> createColorCorrection(
    const OutputCorrectionBase &settings) {
    return createColorCorrection(settings.colorCorrection(), settings.gamma());
}

std::unique_ptr<ColorCorrectionInterface> createColorCorrection(ColorCorrection kind, float gamma) {
    switch (kind) {
        case ColorCorrection::Gamma:
            if (!(gamma > 0.0f) || !std::isfinite(gamma)) {
                message(kMsgWarning, 6,
                        "Output gamma %g is not positive; colours are not corrected",
                        double(gamma));
                return std::make_unique<NilColorCorrection>();
            }
            return std::make_unique<GammaColorCorrection>(gamma);
        case ColorCorrection::SRGB:
            return std::make_unique<SRGBColorCorrection>();
        default:
            return std::make_unique<NilColorCorrection>();
    }
}

}  // namespace ox
