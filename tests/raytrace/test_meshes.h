#pragma once

#include <cmath>
#include <cstdint>
#include <vector>

#include "core/types.h"
#include "raytrace/complete_grid.h"
#include "raytrace/render_stats.h"

/// Procedural meshes shaped like scanned models, for tests and benchmarks of the tracer.
namespace ox::testmesh {

/// An indexed triangle mesh.
struct Mesh {
    std::vector<Vec3> positions;
    std::vector<uint32_t> indices;
    size_t triangleCount() const { return indices.size() / 3; }
};

/// A lumpy closed surface like a scanned statue: a sphere of rings x segments quads with a sum of
/// bumps as its radius (about 2 * rings * segments triangles, denser near the poles).
inline Mesh blob(uint32_t rings, uint32_t segments, float scale = 1.0f) {
    Mesh m;
    const float pi = 3.14159265358979f;
    for (uint32_t i = 0; i <= rings; ++i) {
        float theta = pi * float(i) / float(rings);
        for (uint32_t j = 0; j < segments; ++j) {
            float phi = 2.0f * pi * float(j) / float(segments);
            float r = 1.0f + 0.25f * std::sin(3.0f * theta) * std::cos(2.0f * phi) +
                      0.08f * std::sin(11.0f * theta + 1.0f) * std::sin(7.0f * phi) +
                      0.02f * std::sin(37.0f * theta) * std::cos(29.0f * phi);
            // An "ear": a lobe stretched upwards on one side.
            float ear =
                std::exp(-12.0f * ((theta - 0.5f) * (theta - 0.5f) + (phi - 1.0f) * (phi - 1.0f)));
            r += 0.6f * ear;
            m.positions.push_back({scale * r * std::sin(theta) * std::cos(phi),
                                   scale * r * std::cos(theta),
                                   scale * 0.8f * r * std::sin(theta) * std::sin(phi)});
        }
    }
    for (uint32_t i = 0; i < rings; ++i)
        for (uint32_t j = 0; j < segments; ++j) {
            uint32_t a = i * segments + j, b = i * segments + (j + 1) % segments;
            uint32_t c = a + segments, d = b + segments;
            if (i != 0) m.indices.insert(m.indices.end(), {a, c, b});
            if (i + 1 != rings) m.indices.insert(m.indices.end(), {b, c, d});
        }
    return m;
}

/// A long coiled tube like a dragon's body: a (3, 2) torus knot swept by a bumpy circle.
inline Mesh coil(uint32_t along, uint32_t around, float scale = 1.0f) {
    Mesh m;
    const float pi = 3.14159265358979f;
    auto curve = [&](float s) {
        float p = 2.0f, q = 3.0f;
        float r = 2.0f + std::cos(q * s);
        return Vec3(r * std::cos(p * s), r * std::sin(p * s), -std::sin(q * s));
    };
    for (uint32_t i = 0; i < along; ++i) {
        float s = 2.0f * pi * float(i) / float(along);
        Vec3 c = curve(s), t = (curve(s + 1e-3f) - curve(s - 1e-3f)).normalized();
        Vec3 n = cross(t, Vec3(0, 0, 1)).normalized(), b = cross(t, n);
        for (uint32_t j = 0; j < around; ++j) {
            float a = 2.0f * pi * float(j) / float(around);
            float rad = 0.35f + 0.05f * std::sin(13.0f * s) + 0.03f * std::cos(5.0f * a + 7.0f * s);
            Vec3 p = c + (n * std::cos(a) + b * std::sin(a)) * rad;
            m.positions.push_back(p * scale);
        }
    }
    for (uint32_t i = 0; i < along; ++i)
        for (uint32_t j = 0; j < around; ++j) {
            uint32_t i1 = (i + 1) % along, j1 = (j + 1) % around;
            uint32_t a = i * around + j, b = i * around + j1, c = i1 * around + j,
                     d = i1 * around + j1;
            m.indices.insert(m.indices.end(), {a, c, b, b, c, d});
        }
    return m;
}

/// Small deterministic generator (xorshift) for test rays.
struct Rng {
    uint64_t s;
    explicit Rng(uint64_t seed) : s(seed * 2654435761u + 1) {}
    uint32_t next() {
        s ^= s << 13, s ^= s >> 7, s ^= s << 17;
        return uint32_t(s >> 11);
    }
    float uniform() { return float(next() & 0xFFFFFF) / float(0x1000000); }
    Vec3 inBox(const BBox &b) {
        return {b.min.x + (b.max.x - b.min.x) * uniform(),
                b.min.y + (b.max.y - b.min.y) * uniform(),
                b.min.z + (b.max.z - b.min.z) * uniform()};
    }
    Vec3 direction() {
        float z = 2.0f * uniform() - 1.0f, a = 6.2831853f * uniform();
        float r = std::sqrt(std::fmax(0.0f, 1.0f - z * z));
        return {r * std::cos(a), r * std::sin(a), z};
    }
};

/// The mesh as instance 0 of a complete grid, seen by every ray type. It points into the mesh,
/// which must outlive it.
inline InstanceInput instanceOf(const Mesh &m, const char *name) {
    InstanceInput in;
    in.name = name;
    in.mesh.positions = m.positions.data();
    in.mesh.vertexCount = m.positions.size();
    in.mesh.indices = m.indices.data();
    in.mesh.triangleCount = m.triangleCount();
    in.flags = RenderStats::kDefault;
    in.index = 0;
    return in;
}

}  // namespace ox::testmesh
