#pragma once

#include <cstddef>
#include <memory>
#include <vector>

#include "config/settings_frame.h"
#include "core/types.h"

/// Colour corrections applied when colours are reduced to 8 bits for output.
namespace ox {

/// Maps linear colours to output colours; alpha is never changed.
class ColorCorrectionInterface {
public:
    virtual ~ColorCorrectionInterface() = default;
    /// Corrects n colours from input to output (which may be the same array).
    virtual void correct(const Color *input, Color *output, size_t n) const = 0;
    /// Corrects a vector of colours into output (resized to input's length).
    void correct(const std::vector<Color> &input, std::vector<Color> &output) const {
        output.resize(input.size());
        correct(input.data(), output.data(), input.size());
    }
};

/// The nil correction: a copy.
class NilColorCorrection final : public ColorCorrectionInterface {
public:
    using ColorCorrectionInterface::correct;
    void correct(const Color *input, Color *output, size_t n) const override;
};

/// Gamma correction: r, g, b raised to 1 / gamma.
class GammaColorCorrection final : public ColorCorrectionInterface {
public:
    /// gamma must be positive and finite (createColorCorrection checks it).
    explicit GammaColorCorrection(float gamma) : inverse_(1.0f / gamma) {}
    using ColorCorrectionInterface::correct;
    void correct(const Color *input, Color *output, size_t n) const override;
    /// One channel raised to `inverse` (1 / gamma); negative and NaN channels give 0.
    static float gamma(float c, float inverse);

private:
    float inverse_;
};

/// The sRGB transfer function on r, g and b.
class SRGBColorCorrection final : public ColorCorrectionInterface {
public:
    using ColorCorrectionInterface::correct;
    void correct(const Color *input, Color *output, size_t n) const override;
    /// The sRGB transfer function of one channel; negative and NaN channels give 0.
    static float toSRGB(float c);
};

/// The correction of the `colorCorrection` setting with its output gamma. A gamma that is not
/// positive and finite is reported as a warning and gives the nil correction.
std::unique_ptr<ColorCorrectionInterface> createColorCorrection(ColorCorrection kind, float gamma);
/// The correction chosen by the frame settings' output correction.
std::unique_ptr<ColorCorrectionInterface> createColorCorrection(
    const OutputCorrectionBase &settings);

}  // namespace ox
