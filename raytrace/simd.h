#pragma once

#include <immintrin.h>

#include <cstdint>

/// Thin four-wide float and int wrappers over SSE for the packed intersection kernels.
namespace ox {

/// Four floats in one SSE register.
struct float4 {
    __m128 v;

    float4() = default;
    float4(__m128 x) : v(x) {}
    explicit float4(float x) : v(_mm_set1_ps(x)) {}
    static float4 load(const float *p) { return _mm_load_ps(p); }
    static float4 zero() { return _mm_setzero_ps(); }

    operator __m128() const { return v; }
};

inline float4 operator+(float4 a, float4 b) { return _mm_add_ps(a, b); }
inline float4 operator-(float4 a, float4 b) { return _mm_sub_ps(a, b); }
inline float4 operator*(float4 a, float4 b) { return _mm_mul_ps(a, b); }
inline float4 operator/(float4 a, float4 b) { return _mm_div_ps(a, b); }
inline float4 operator<(float4 a, float4 b) { return _mm_cmplt_ps(a, b); }
inline float4 operator>(float4 a, float4 b) { return _mm_cmpgt_ps(a, b); }
inline float4 operator&(float4 a, float4 b) { return _mm_and_ps(a, b); }
inline float4 operator|(float4 a, float4 b) { return _mm_or_ps(a, b); }
inline float4 operator^(float4 a, float4 b) { return _mm_xor_ps(a, b); }
/// a & ~mask.
inline float4 andNot(float4 mask, float4 a) { return _mm_andnot_ps(mask, a); }
/// One bit per lane from the sign bits.
inline int movemask(float4 a) { return _mm_movemask_ps(a); }

/// Four 32-bit integers in one SSE register.
struct int4 {
    __m128i v;

    int4() = default;
    int4(__m128i x) : v(x) {}
    explicit int4(int32_t x) : v(_mm_set1_epi32(x)) {}
    static int4 load(const void *p) { return _mm_load_si128(static_cast<const __m128i *>(p)); }
    operator __m128i() const { return v; }
};

inline int4 operator&(int4 a, int4 b) { return _mm_and_si128(a, b); }
inline int4 operator|(int4 a, int4 b) { return _mm_or_si128(a, b); }
/// All-ones lanes where a == b.
inline int4 cmpeq(int4 a, int4 b) { return _mm_cmpeq_epi32(a, b); }
inline int4 shiftLeft(int4 a, int n) { return _mm_slli_epi32(a, n); }
/// Reinterprets integer lanes as float lanes (bit masks).
inline float4 asFloat(int4 a) { return _mm_castsi128_ps(a); }

}  // namespace ox
