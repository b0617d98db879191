#pragma once

#include <cstddef>
#include <cstdint>

/// Conversion of 32-bit floats to 16-bit half floats for half texel and frame buffers.
namespace ox {

/// The largest magnitude converted without clamping; larger values would round to infinity.
constexpr float kHalfClampLimit = 65503.0f;

/// The half of value without any message: values beyond +-65503 are clamped to it (and
/// clamped is set), zero and float denormals become a signed zero, NaN stays NaN. The
/// mantissa is rounded by adding 4096 before the 13-bit shift.
inline uint16_t halfFromFloatQuiet(float value, bool &clamped) {
    clamped = false;
    if (value > kHalfClampLimit) {
        value = kHalfClampLimit;
        clamped = true;
    } else if (value < -kHalfClampLimit) {
        value = -kHalfClampLimit;
        clamped = true;
    }
    uint32_t bits;
    __builtin_memcpy(&bits, &value, 4);
    const uint16_t sign = uint16_t((bits >> 16) & 0x8000u);
    const int32_t exponent = int32_t((bits >> 23) & 0xffu);
    uint32_t mantissa = bits & 0x7fffffu;
    if (exponent == 0xff) return uint16_t(sign | 0x7e00u);  // NaN (infinities were clamped)
    const int32_t e = exponent - 112;                       // rebias 127 -> 15
    if (e <= 0) {
        // Half denormals (or zero when too small): the implicit bit joins the mantissa.
        if (e < -10) return sign;
        mantissa |= 0x800000u;
        const int shift = 14 - e;
        return uint16_t(sign | ((mantissa + (1u << (shift - 1))) >> shift));
    }
    // A mantissa carry moves into the exponent, which is the correct rounding up.
    return uint16_t(sign | ((uint32_t(e) << 10) + ((mantissa + 0x1000u) >> 13)));
}

/// The half of value; a clamped value is reported with a warning.
uint16_t halfFromFloat(float value);

/// Converts n values; the clamped ones are reported in one warning with their count. Returns
/// that count.
size_t halfFromFloat(const float *values, uint16_t *halves, size_t n);

}  // namespace ox
