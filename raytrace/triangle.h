#pragma once

#include <cstdint>

namespace ox {

/// One triangle of a shape: three 32-bit indices into the shape's vertex list and the index of
/// its material in the shape's material slots. 16 bytes, so a shape of N triangles is N * 16.
struct Triangle {
    uint32_t v[3] = {0, 0, 0};
    uint32_t material = 0;

    bool operator==(const Triangle &o) const = default;
};
static_assert(sizeof(Triangle) == 16);

}  // namespace ox
