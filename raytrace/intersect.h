#pragma once

#include <algorithm>
#include <atomic>
#include <cmath>
#include <cstdint>
#include <limits>

#include "core/types.h"
#include "raytrace/ray.h"
#include "raytrace/simd.h"

/// The ray/primitive kernels: the single-triangle test, its four-wide packed twin and the
/// prepared per-query ray data they share.
namespace ox {

/// Hits at or below this distance are ignored (self-intersection guard).
constexpr float kMinHitDistance = 1e-6f;
/// The unbounded query distance.
constexpr float kInfiniteDistance = kLargestFloat;

namespace detail {
/// On where the processor has AVX2, unless switched off with setWideTests.
extern std::atomic<bool> wideTests;
}  // namespace detail

/// Whether queries run the eight-wide AVX2 tests of intersect_wide.h (same answers, same bits).
inline bool wideTestsEnabled() { return detail::wideTests.load(std::memory_order_relaxed); }
/// Whether the processor can run the eight-wide tests.
bool wideTestsAvailable();
/// Switches the eight-wide tests on (where available) or off for the queries prepared from now
/// on; returns whether they now run. For comparisons and tests.
bool setWideTests(bool on);

/// Ray data prepared once per query (and once per instance in object space).
struct TraceRay {
    Vec3 o, d, inv;              ///< Origin, direction and its component-wise reciprocal.
    uint32_t required = 0;       ///< Flag bits of which a visible object needs one.
    float time = 0.0f;           ///< Shutter time in [0, 1].
    bool overrideFlags = false;  ///< Inside an instance: test every triangle with instFlags.
    bool wide = false;           ///< Run the eight-wide tests (chosen once per query).
    uint32_t instFlags = 0;
    float4 ox, oy, oz, dx, dy, dz, ix, iy, iz;
    int4 flagKeep, flagSet, required4;  ///< Lane flags = (packet flags & keep) | set.

    /// Switches to testing every triangle with the flags of an instance.
    void setInstanceFlags(uint32_t flags) {
        overrideFlags = true;
        instFlags = flags;
        flagKeep = int4(0);
        flagSet = int4(int32_t(flags));
    }

    /// Prepares the data; false when the ray can hit nothing (non-finite or zero direction).
    bool prepare(const Vec3 &origin, const Vec3 &direction, uint32_t requiredFlags, float t) {
        o = origin;
        d = direction;
        required = requiredFlags;
        time = t >= 0.0f ? (t <= 1.0f ? t : 1.0f) : 0.0f;  // NaN becomes 0
        if (!isFinite(o) || !isFinite(d) || d.lengthSquared() == 0.0f) return false;
        // A zero component gets a huge finite reciprocal instead of infinity, so that slab tests
        // never form 0 * inf; the grid walk tests zero components itself.
        auto recip = [](float x) { return x != 0.0f ? 1.0f / x : 1e30f; };
        inv = {recip(d.x), recip(d.y), recip(d.z)};
        ix = float4(inv.x), iy = float4(inv.y), iz = float4(inv.z);
        ox = float4(o.x), oy = float4(o.y), oz = float4(o.z);
        dx = float4(d.x), dy = float4(d.y), dz = float4(d.z);
        overrideFlags = false;
        flagKeep = int4(-1);
        flagSet = int4(0);
        required4 = int4(int32_t(required));
        wide = wideTestsEnabled();
        return true;
    }
};

/// Running state of a query: the limit (best distance so far or the caller's maximum) and what
/// was hit. kind/prim/inst name the hit inside the primitive store that owns it.
struct TraceState {
    float limit = kInfiniteDistance;
    bool found = false;
    float u = 0.0f, v = 0.0f;
    uint8_t kind = 0;   ///< Item kind of the hit (see Grid::ItemKind).
    uint32_t prim = 0;  ///< Index of the triangle (or motion triangle) in its store.
    uint32_t inst = 0;  ///< For hits through an instance: the instance's index in the store.
    uint32_t id = 0;    ///< Instance hit: the triangle's index inside its shape.
};

/// True when an object with these flags is seen by rays that need one of the required bits.
inline bool flagsVisible(uint32_t flags, uint32_t required) { return (flags & required) != 0; }

/// One triangle as p0 and the edges e1 = p1 - p0, e2 = p2 - p0, with the object's flag word.
/// Three rows of four words, each 16-byte aligned, so that four consecutive triangles load as a
/// packed packet: the rows transpose into p0, e1 and e2 per axis, and the fourth lane of the p0
/// rows into the flags.
struct alignas(16) IntersectTriangle {
    Vec3 p0;
    uint32_t flags = 0;
    Vec3 e1;
    uint32_t id = 0;  ///< Triangle index inside its shape.
    Vec3 e2;
    uint32_t instance = kNoInstance;  ///< Scene instance the triangle came from.

    /// Bounding box of the three corners (stored triangles are finite).
    BBox bounds() const {
        const Vec3 p1 = p0 + e1, p2 = p0 + e2;
        return {{std::min({p0.x, p1.x, p2.x}), std::min({p0.y, p1.y, p2.y}),
                 std::min({p0.z, p1.z, p2.z})},
                {std::max({p0.x, p1.x, p2.x}), std::max({p0.y, p1.y, p2.y}),
                 std::max({p0.z, p1.z, p2.z})}};
    }
};
static_assert(sizeof(IntersectTriangle) == 48, "three rows of four words");

/// The single-triangle test. Returns true for 1e-6 < t < tmax with t, u, v set. Back faces are
/// culled unless DoubleSided; Opposite culls the front instead. The sign of det decides the side
/// (det = e1 . (d x e2) = -(e1 x e2) . d). The operation order is the packed kernel's, lane for
/// lane, so both give bit-identical answers.
inline bool intersectTriangle(const Vec3 &p0, const Vec3 &e1, const Vec3 &e2, uint32_t flags,
                              const TraceRay &r, float tmax, float &tOut, float &uOut,
                              float &vOut) {
    if (!flagsVisible(flags, r.required)) return false;
    const Vec3 &d = r.d;
    float px = d.y * e2.z - d.z * e2.y;
    float py = d.z * e2.x - d.x * e2.z;
    float pz = d.x * e2.y - d.y * e2.x;
    float det = e1.x * px + e1.y * py + e1.z * pz;
    if (!(flags & kFlagDoubleSided)) {
        float sdet = (flags & kFlagOpposite) ? -det : det;
        if (sdet < 0.0f) return false;
    }
    float inv = 1.0f / det;
    float qx = r.o.x - p0.x, qy = r.o.y - p0.y, qz = r.o.z - p0.z;
    float u = (qx * px + qy * py + qz * pz) * inv;
    if (u < 0.0f) return false;
    float rx = qy * e1.z - qz * e1.y;
    float ry = qz * e1.x - qx * e1.z;
    float rz = qx * e1.y - qy * e1.x;
    float v = (d.x * rx + d.y * ry + d.z * rz) * inv;
    if (v < 0.0f) return false;
    float t = (e2.x * rx + e2.y * ry + e2.z * rz) * inv;
    if (u + v > 1.0f) return false;
    if (!(t > kMinHitDistance && t < tmax)) return false;
    tOut = t, uOut = u, vOut = v;
    return true;
}

/// The single-triangle test on a stored triangle, with the flags the ray context chooses.
inline bool intersectTriangle(const IntersectTriangle &tri, const TraceRay &r, float tmax, float &t,
                              float &u, float &v) {
    return intersectTriangle(tri.p0, tri.e1, tri.e2, r.overrideFlags ? r.instFlags : tri.flags, r,
                             tmax, t, u, v);
}

/// Four triangles in structure-of-arrays form, as the packed test reads them.
struct IntersectSSETriangle {
    float4 p0[3], e1[3], e2[3];
    int4 flags;

    /// Loads four consecutive triangles (16-byte aligned).
    __attribute__((always_inline)) static IntersectSSETriangle load(const IntersectTriangle *t) {
        IntersectSSETriangle pk;
        const float *f = reinterpret_cast<const float *>(t);
        for (int row = 0; row < 3; ++row) {
            __m128 r0 = _mm_load_ps(f + 4 * row), r1 = _mm_load_ps(f + 12 + 4 * row),
                   r2 = _mm_load_ps(f + 24 + 4 * row), r3 = _mm_load_ps(f + 36 + 4 * row);
            _MM_TRANSPOSE4_PS(r0, r1, r2, r3);
            float4 *dst = row == 0 ? pk.p0 : row == 1 ? pk.e1 : pk.e2;
            dst[0] = r0, dst[1] = r1, dst[2] = r2;
            if (row == 0) pk.flags = _mm_castps_si128(r3);
        }
        return pk;
    }
};

/// Tests the four lanes; returns all ones in the lanes that hit with 1e-6 < t < tmax. Lanes with
/// NaN corners never hit.
__attribute__((always_inline)) inline float4 intersectPacketLanes(const IntersectSSETriangle &pk,
                                                                  const TraceRay &r, float tmax,
                                                                  float4 &tOut, float4 &uOut,
                                                                  float4 &vOut) {
    int4 flags = (pk.flags & r.flagKeep) | r.flagSet;
    int4 zero(0);
    // Lanes whose flags lack every required bit are invisible.
    float4 invisible = asFloat(cmpeq(flags & r.required4, zero));
    float4 e1x = pk.e1[0], e1y = pk.e1[1], e1z = pk.e1[2];
    float4 e2x = pk.e2[0], e2y = pk.e2[1], e2z = pk.e2[2];
    float4 px = r.dy * e2z - r.dz * e2y;
    float4 py = r.dz * e2x - r.dx * e2z;
    float4 pz = r.dx * e2y - r.dy * e2x;
    float4 det = e1x * px + e1y * py + e1z * pz;
    // Culling: flip the sign for Opposite (bit 9 moved to the sign bit), cull negative values
    // unless DoubleSided.
    float4 singleSided = asFloat(cmpeq(flags & int4(int32_t(kFlagDoubleSided)), zero));
    float4 sdet = det ^ asFloat(shiftLeft(flags & int4(int32_t(kFlagOpposite)), 22));
    float4 miss = invisible | (singleSided & (sdet < float4::zero()));
    float4 inv = float4(1.0f) / det;
    float4 qx = r.ox - pk.p0[0];
    float4 qy = r.oy - pk.p0[1];
    float4 qz = r.oz - pk.p0[2];
    float4 u = (qx * px + qy * py + qz * pz) * inv;
    miss = miss | (u < float4::zero());
    float4 rx = qy * e1z - qz * e1y;
    float4 ry = qz * e1x - qx * e1z;
    float4 rz = qx * e1y - qy * e1x;
    float4 v = (r.dx * rx + r.dy * ry + r.dz * rz) * inv;
    miss = miss | (v < float4::zero());
    float4 t = (e2x * rx + e2y * ry + e2z * rz) * inv;
    miss = miss | ((u + v) > float4(1.0f));
    float4 hit = andNot(miss, (t > float4(kMinHitDistance)) & (t < float4(tmax)));
    tOut = t, uOut = u, vOut = v;
    return hit;
}

/// intersectPacketLanes as a lane bit mask.
__attribute__((always_inline)) inline int intersectPacket(const IntersectSSETriangle &pk,
                                                          const TraceRay &r, float tmax,
                                                          float4 &tOut, float4 &uOut,
                                                          float4 &vOut) {
    return movemask(intersectPacketLanes(pk, r, tmax, tOut, uOut, vOut));
}

}  // namespace ox
