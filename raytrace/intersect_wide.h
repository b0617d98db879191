#pragma once

#include <immintrin.h>

#include "raytrace/intersect.h"

/// The eight-wide twin of the packed triangle test: two packets of four in one AVX2 pass. Built
/// for processors with AVX2 only (the functions carry their own target; callers check
/// wideTestsEnabled() before they run them) and without fused multiply-adds, so that every lane
/// gives the bits the four-wide and single-triangle tests give.
namespace ox {

#define OX_WIDE_INLINE __attribute__((target("avx2"), always_inline)) inline

/// Two packets (eight triangles) in structure-of-arrays form: lanes 0-3 the first packet's
/// triangles, lanes 4-7 the second's.
struct IntersectWideTriangle {
    __m256 p0[3], e1[3], e2[3];
    __m256i flags;

    /// Loads the packets starting at a and b (four consecutive, 16-byte aligned triangles each).
    OX_WIDE_INLINE static IntersectWideTriangle load(const IntersectTriangle *a,
                                                     const IntersectTriangle *b) {
        IntersectWideTriangle pk;
        const float *fa = reinterpret_cast<const float *>(a);
        const float *fb = reinterpret_cast<const float *>(b);
        for (int row = 0; row < 3; ++row) {
            __m256 r0 = rows(fa, fb, 4 * row), r1 = rows(fa, fb, 12 + 4 * row),
                   r2 = rows(fa, fb, 24 + 4 * row), r3 = rows(fa, fb, 36 + 4 * row);
            // The four-by-four transpose inside each 128-bit half.
            __m256 t0 = _mm256_unpacklo_ps(r0, r1), t1 = _mm256_unpackhi_ps(r0, r1);
            __m256 t2 = _mm256_unpacklo_ps(r2, r3), t3 = _mm256_unpackhi_ps(r2, r3);
            __m256 *dst = row == 0 ? pk.p0 : row == 1 ? pk.e1 : pk.e2;
            dst[0] = _mm256_shuffle_ps(t0, t2, 0x44);
            dst[1] = _mm256_shuffle_ps(t0, t2, 0xEE);
            dst[2] = _mm256_shuffle_ps(t1, t3, 0x44);
            if (row == 0) pk.flags = _mm256_castps_si256(_mm256_shuffle_ps(t1, t3, 0xEE));
        }
        return pk;
    }

private:
    /// Row offset of the packet at a in the low half, of the packet at b in the high half.
    OX_WIDE_INLINE static __m256 rows(const float *a, const float *b, int offset) {
        return _mm256_insertf128_ps(_mm256_castps128_ps256(_mm_load_ps(a + offset)),
                                    _mm_load_ps(b + offset), 1);
    }
};

/// A four-wide ray value in both halves.
OX_WIDE_INLINE __m256 wide(const float4 &v) { return _mm256_set_m128(v, v); }
OX_WIDE_INLINE __m256i wide(const int4 &v) { return _mm256_set_m128i(v, v); }

namespace wide_ops {
OX_WIDE_INLINE __m256 mul(__m256 a, __m256 b) { return _mm256_mul_ps(a, b); }
OX_WIDE_INLINE __m256 add(__m256 a, __m256 b) { return _mm256_add_ps(a, b); }
OX_WIDE_INLINE __m256 sub(__m256 a, __m256 b) { return _mm256_sub_ps(a, b); }
}  // namespace wide_ops

/// Tests the eight lanes with the operations of intersectPacket in its order; returns the lane
/// bit mask of hits with 1e-6 < t < tmax.
OX_WIDE_INLINE int intersectPacketPair(const IntersectWideTriangle &pk, const TraceRay &r,
                                       float tmax, __m256 &tOut, __m256 &uOut, __m256 &vOut) {
    using namespace wide_ops;
    const __m256i flags =
        _mm256_or_si256(_mm256_and_si256(pk.flags, wide(r.flagKeep)), wide(r.flagSet));
    const __m256i zero = _mm256_setzero_si256();
    const __m256 invisible =
        _mm256_castsi256_ps(_mm256_cmpeq_epi32(_mm256_and_si256(flags, wide(r.required4)), zero));
    const __m256 dx = wide(r.dx), dy = wide(r.dy), dz = wide(r.dz);
    const __m256 e1x = pk.e1[0], e1y = pk.e1[1], e1z = pk.e1[2];
    const __m256 e2x = pk.e2[0], e2y = pk.e2[1], e2z = pk.e2[2];
    __m256 px = sub(mul(dy, e2z), mul(dz, e2y));
    __m256 py = sub(mul(dz, e2x), mul(dx, e2z));
    __m256 pz = sub(mul(dx, e2y), mul(dy, e2x));
    __m256 det = add(add(mul(e1x, px), mul(e1y, py)), mul(e1z, pz));
    const __m256 singleSided = _mm256_castsi256_ps(_mm256_cmpeq_epi32(
        _mm256_and_si256(flags, _mm256_set1_epi32(int32_t(kFlagDoubleSided))), zero));
    const __m256 sdet = _mm256_xor_ps(
        det, _mm256_castsi256_ps(_mm256_slli_epi32(
                 _mm256_and_si256(flags, _mm256_set1_epi32(int32_t(kFlagOpposite))), 22)));
    const __m256 zeroF = _mm256_setzero_ps();
    __m256 miss =
        _mm256_or_ps(invisible, _mm256_and_ps(singleSided, _mm256_cmp_ps(sdet, zeroF, _CMP_LT_OS)));
    __m256 inv = _mm256_div_ps(_mm256_set1_ps(1.0f), det);
    __m256 qx = sub(wide(r.ox), pk.p0[0]);
    __m256 qy = sub(wide(r.oy), pk.p0[1]);
    __m256 qz = sub(wide(r.oz), pk.p0[2]);
    __m256 u = mul(add(add(mul(qx, px), mul(qy, py)), mul(qz, pz)), inv);
    miss = _mm256_or_ps(miss, _mm256_cmp_ps(u, zeroF, _CMP_LT_OS));
    __m256 rx = sub(mul(qy, e1z), mul(qz, e1y));
    __m256 ry = sub(mul(qz, e1x), mul(qx, e1z));
    __m256 rz = sub(mul(qx, e1y), mul(qy, e1x));
    __m256 v = mul(add(add(mul(dx, rx), mul(dy, ry)), mul(dz, rz)), inv);
    miss = _mm256_or_ps(miss, _mm256_cmp_ps(v, zeroF, _CMP_LT_OS));
    __m256 t = mul(add(add(mul(e2x, rx), mul(e2y, ry)), mul(e2z, rz)), inv);
    miss = _mm256_or_ps(miss, _mm256_cmp_ps(add(u, v), _mm256_set1_ps(1.0f), _CMP_GT_OS));
    __m256 hit = _mm256_andnot_ps(
        miss, _mm256_and_ps(_mm256_cmp_ps(t, _mm256_set1_ps(kMinHitDistance), _CMP_GT_OS),
                            _mm256_cmp_ps(t, _mm256_set1_ps(tmax), _CMP_LT_OS)));
    tOut = t, uOut = u, vOut = v;
    return _mm256_movemask_ps(hit);
}

}  // namespace ox
