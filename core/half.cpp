#include "core/half.h"

#include "core/message.h"

namespace ox {

uint16_t halfFromFloat(float value) {
    bool clamped = false;
    const uint16_t h = halfFromFloatQuiet(value, clamped);
    if (clamped)
        message(kMsgWarning, 6,
                "Clamping value of %f to %f to avoid -inf in half float framebuffer", double(value),
                double(value < 0.0f ? -kHalfClampLimit : kHalfClampLimit));
    return h;
}

size_t halfFromFloat(const float *values, uint16_t *halves, size_t n) {
    size_t count = 0;
    for (size_t i = 0; i < n; ++i) {
        bool clamped = false;
        halves[i] = halfFromFloatQuiet(values[i], clamped);
        count += clamped;
    }
    if (count > 0)
        message(kMsgWarning, 6,
                "Clamped %zu values to [-%f, %f] to avoid inf in half float framebuffer", count,
                double(kHalfClampLimit), double(kHalfClampLimit));
    return count;
}

}  // namespace ox
