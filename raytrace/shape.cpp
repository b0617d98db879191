#include "raytrace/shape.h"

namespace ox {

void Shape::computeBounds() {
    BBox b;
    const uint32_t n = vertices_.size();
    const float *x = vertices_.px(), *y = vertices_.py(), *z = vertices_.pz();
    for (uint32_t i = 0; i < n; ++i) b.extend(Vec3{x[i], y[i], z[i]});
    bounds_ = b;
}

size_t Shape::memoryBytes() const {
    return vertices_.memoryBytes() + triangles_.capacity() * sizeof(Triangle) +
           materials_.capacity() * sizeof(const MaterialHandle *) + name_.capacity();
}

}  // namespace ox
