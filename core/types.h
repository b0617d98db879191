#pragma once

#include <cmath>
#include <cstdint>
#include <cstring>
#include <limits>
#include <utility>

/// Shared value types: colours, vectors, matrices, bounding boxes and pixel regions.
namespace ox {

/// Luminance of a linear RGB triple; the one rule used everywhere in the system.
inline float luminance(float r, float g, float b) { return 0.299f * r + 0.587f * g + 0.114f * b; }

/// Reciprocal square root refined by one Newton step.
inline float refinedRsqrt(float x) {
    float y = 1.0f / std::sqrt(x);
    return y * (1.5f - 0.5f * x * y * y);
}

/// RGBA colour of four floats.
struct Color {
    float r = 0.0f, g = 0.0f, b = 0.0f, a = 0.0f;

    constexpr Color() = default;
    constexpr Color(float r_, float g_, float b_, float a_ = 1.0f) : r(r_), g(g_), b(b_), a(a_) {}

    static constexpr Color white() { return {1.0f, 1.0f, 1.0f, 1.0f}; }
    static constexpr Color black() { return {0.0f, 0.0f, 0.0f, 0.0f}; }

    float luminance() const { return ox::luminance(r, g, b); }

    Color operator+(const Color &o) const { return {r + o.r, g + o.g, b + o.b, a + o.a}; }
    Color operator-(const Color &o) const { return {r - o.r, g - o.g, b - o.b, a - o.a}; }
    Color operator*(const Color &o) const { return {r * o.r, g * o.g, b * o.b, a * o.a}; }
    Color operator*(float s) const { return {r * s, g * s, b * s, a * s}; }
    Color &operator+=(const Color &o) {
        r += o.r, g += o.g, b += o.b, a += o.a;
        return *this;
    }
    Color &operator*=(float s) {
        r *= s, g *= s, b *= s, a *= s;
        return *this;
    }
    bool operator==(const Color &o) const = default;
};

/// Two-component vector of float or int.
template <typename T>
struct Vec2T {
    T x = 0, y = 0;

    constexpr Vec2T() = default;
    constexpr Vec2T(T x_, T y_) : x(x_), y(y_) {}

    Vec2T operator+(const Vec2T &o) const { return {x + o.x, y + o.y}; }
    Vec2T operator-(const Vec2T &o) const { return {x - o.x, y - o.y}; }
    Vec2T operator*(T s) const { return {x * s, y * s}; }
    T &operator[](int i) { return i == 0 ? x : y; }
    T operator[](int i) const { return i == 0 ? x : y; }
    bool operator==(const Vec2T &o) const = default;
};
using Vec2 = Vec2T<float>;
using Vec2i = Vec2T<int32_t>;

/// Three-component float vector (points, directions, normals).
struct Vec3 {
    float x = 0.0f, y = 0.0f, z = 0.0f;
    static constexpr float Vec3::*kComponents[3] = {&Vec3::x, &Vec3::y, &Vec3::z};

    constexpr Vec3() = default;
    constexpr Vec3(float x_, float y_, float z_) : x(x_), y(y_), z(z_) {}

    /// Component i (0 x, 1 y, 2 z), through a member table: no branch, no pointer arithmetic
    /// across members.
    float &operator[](int i) { return this->*kComponents[i]; }
    float operator[](int i) const { return this->*kComponents[i]; }

    Vec3 operator+(const Vec3 &o) const { return {x + o.x, y + o.y, z + o.z}; }
    Vec3 operator-(const Vec3 &o) const { return {x - o.x, y - o.y, z - o.z}; }
    Vec3 operator-() const { return {-x, -y, -z}; }
    Vec3 operator*(float s) const { return {x * s, y * s, z * s}; }
    Vec3 operator/(float s) const { return {x / s, y / s, z / s}; }
    Vec3 &operator+=(const Vec3 &o) {
        x += o.x, y += o.y, z += o.z;
        return *this;
    }
    Vec3 &operator-=(const Vec3 &o) {
        x -= o.x, y -= o.y, z -= o.z;
        return *this;
    }
    Vec3 &operator*=(float s) {
        x *= s, y *= s, z *= s;
        return *this;
    }
    bool operator==(const Vec3 &o) const = default;

    float lengthSquared() const { return x * x + y * y + z * z; }
    float length() const { return std::sqrt(lengthSquared()); }

    /// Scales to unit length with the refined reciprocal square root; a zero vector stays zero.
    Vec3 &normalize() {
        float l2 = lengthSquared();
        if (l2 > 0.0f) *this *= refinedRsqrt(l2);
        return *this;
    }
    Vec3 normalized() const { return Vec3(*this).normalize(); }
};

inline Vec3 operator*(float s, const Vec3 &v) { return v * s; }
inline float dot(const Vec3 &a, const Vec3 &b) { return a.x * b.x + a.y * b.y + a.z * b.z; }
inline Vec3 cross(const Vec3 &a, const Vec3 &b) {
    return {a.y * b.z - a.z * b.y, a.z * b.x - a.x * b.z, a.x * b.y - a.y * b.x};
}
inline Vec3 vmin(const Vec3 &a, const Vec3 &b) {
    return {std::fmin(a.x, b.x), std::fmin(a.y, b.y), std::fmin(a.z, b.z)};
}
inline Vec3 vmax(const Vec3 &a, const Vec3 &b) {
    return {std::fmax(a.x, b.x), std::fmax(a.y, b.y), std::fmax(a.z, b.z)};
}
inline bool isFinite(const Vec3 &v) {
    return std::isfinite(v.x) && std::isfinite(v.y) && std::isfinite(v.z);
}

/// 4 x 4 float matrix for row vectors: p' = p * M, translation in the last row (m[3][0..2]).
struct Mtx4 {
    float m[4][4] = {{1, 0, 0, 0}, {0, 1, 0, 0}, {0, 0, 1, 0}, {0, 0, 0, 1}};

    static Mtx4 identity() { return {}; }
    static Mtx4 translation(const Vec3 &t) {
        Mtx4 r;
        r.m[3][0] = t.x, r.m[3][1] = t.y, r.m[3][2] = t.z;
        return r;
    }
    static Mtx4 scale(const Vec3 &s) {
        Mtx4 r;
        r.m[0][0] = s.x, r.m[1][1] = s.y, r.m[2][2] = s.z;
        return r;
    }

    float *operator[](int i) { return m[i]; }
    const float *operator[](int i) const { return m[i]; }
    bool operator==(const Mtx4 &o) const { return std::memcmp(m, o.m, sizeof m) == 0; }

    /// this * o: applying the result equals applying this first, then o.
    Mtx4 operator*(const Mtx4 &o) const {
        Mtx4 r;
        for (int i = 0; i < 4; ++i)
            for (int j = 0; j < 4; ++j) {
                float s = 0.0f;
                for (int k = 0; k < 4; ++k) s += m[i][k] * o.m[k][j];
                r.m[i][j] = s;
            }
        return r;
    }

    /// Transforms a point (w = 1, with the projective divide when the last column is not 0,0,0,1).
    Vec3 transformPoint(const Vec3 &p) const {
        float x = p.x * m[0][0] + p.y * m[1][0] + p.z * m[2][0] + m[3][0];
        float y = p.x * m[0][1] + p.y * m[1][1] + p.z * m[2][1] + m[3][1];
        float z = p.x * m[0][2] + p.y * m[1][2] + p.z * m[2][2] + m[3][2];
        float w = p.x * m[0][3] + p.y * m[1][3] + p.z * m[2][3] + m[3][3];
        if (w != 1.0f && w != 0.0f) return {x / w, y / w, z / w};
        return {x, y, z};
    }
    /// Transforms a direction (w = 0): no translation.
    Vec3 transformVector(const Vec3 &v) const {
        return {v.x * m[0][0] + v.y * m[1][0] + v.z * m[2][0],
                v.x * m[0][1] + v.y * m[1][1] + v.z * m[2][1],
                v.x * m[0][2] + v.y * m[1][2] + v.z * m[2][2]};
    }

    Mtx4 transposed() const {
        Mtx4 r;
        for (int i = 0; i < 4; ++i)
            for (int j = 0; j < 4; ++j) r.m[i][j] = m[j][i];
        return r;
    }
    /// Determinant of the upper 3 x 3 block (negative when the placement mirrors).
    float determinant3() const {
        return m[0][0] * (m[1][1] * m[2][2] - m[1][2] * m[2][1]) -
               m[0][1] * (m[1][0] * m[2][2] - m[1][2] * m[2][0]) +
               m[0][2] * (m[1][0] * m[2][1] - m[1][1] * m[2][0]);
    }
    bool isFinite() const {
        for (const auto &row : m)
            for (float v : row)
                if (!std::isfinite(v)) return false;
        return true;
    }
    /// General inverse; returns false (and leaves out unchanged) for a singular matrix.
    bool inverse(Mtx4 &out) const;
};

/// The largest finite float (3.4028235e38): unbounded distances, empty boxes, open limits.
inline constexpr float kLargestFloat = std::numeric_limits<float>::max();

/// Axis-aligned box of six floats; the empty box has min +FLT_MAX and max -FLT_MAX.
struct BBox {
    static constexpr float kEmptyMin = kLargestFloat;
    Vec3 min{kEmptyMin, kEmptyMin, kEmptyMin};
    Vec3 max{-kEmptyMin, -kEmptyMin, -kEmptyMin};

    constexpr BBox() = default;
    constexpr BBox(const Vec3 &mn, const Vec3 &mx) : min(mn), max(mx) {}

    static constexpr BBox empty() { return {}; }
    bool isEmpty() const { return !(min.x <= max.x && min.y <= max.y && min.z <= max.z); }
    /// True when all six values are finite and min <= max on every axis.
    bool isValid() const { return ox::isFinite(min) && ox::isFinite(max) && !isEmpty(); }

    void extend(const Vec3 &p) {
        min = vmin(min, p);
        max = vmax(max, p);
    }
    void extend(const BBox &b) {
        min = vmin(min, b.min);
        max = vmax(max, b.max);
    }
    Vec3 extent() const { return max - min; }
    Vec3 center() const { return (min + max) * 0.5f; }
    bool contains(const Vec3 &p) const {
        return p.x >= min.x && p.x <= max.x && p.y >= min.y && p.y <= max.y && p.z >= min.z &&
               p.z <= max.z;
    }
    bool operator==(const BBox &o) const = default;
};

/// Pixel rectangle: xMin, yMin inclusive, xMax, yMax exclusive; row 0 is the bottom row.
struct Region {
    int32_t xMin = 0, yMin = 0, xMax = 0, yMax = 0;
    bool valid = false;

    constexpr Region() = default;
    constexpr Region(int32_t x0, int32_t y0, int32_t x1, int32_t y1, bool v = true)
        : xMin(x0), yMin(y0), xMax(x1), yMax(y1), valid(v) {}

    int64_t width() const { return xMax > xMin ? int64_t(xMax) - xMin : 0; }
    int64_t height() const { return yMax > yMin ? int64_t(yMax) - yMin : 0; }
    int64_t area() const { return width() * height(); }
    bool isEmpty() const { return !valid || area() == 0; }
    bool contains(int32_t x, int32_t y) const {
        return valid && x >= xMin && x < xMax && y >= yMin && y < yMax;
    }
    bool operator==(const Region &o) const = default;
};

/// A pixel rectangle with inclusive bounds, the form in which regions are cut into tiles and
/// handed out; row 0 is the bottom row.
struct Tile {
    uint32_t xMin = 0, xMax = 0, yMin = 0, yMax = 0;
    bool valid = false;  ///< false for the tile returned when none is left
    /// Place in the region's tile grid, row * columns + column, whatever the hand-out order.
    uint32_t index = 0;

    /// Width in pixels.
    uint32_t width() const { return xMax - xMin + 1; }
    /// Height in pixels.
    uint32_t height() const { return yMax - yMin + 1; }
    bool operator==(const Tile &o) const = default;
};

/// The tile covering a region (exclusive maxima made inclusive). An empty or invalid region, or
/// one reaching below 0, gives an invalid all-zero tile.
constexpr Tile tileOfRegion(const Region &r) {
    if (!r.valid || r.xMax <= r.xMin || r.yMax <= r.yMin || r.xMin < 0 || r.yMin < 0) return Tile{};
    return Tile{uint32_t(r.xMin), uint32_t(r.xMax) - 1u, uint32_t(r.yMin), uint32_t(r.yMax) - 1u,
                true};
}

/// The region a tile covers (inclusive maxima made exclusive). An invalid tile, one with a
/// maximum below its minimum, or one whose bounds do not fit a region gives the invalid region.
constexpr Region regionOfTile(const Tile &t) {
    constexpr uint32_t kLast = uint32_t(INT32_MAX) - 1u;  // the largest inclusive max that fits
    if (!t.valid || t.xMax < t.xMin || t.yMax < t.yMin || t.xMax > kLast || t.yMax > kLast)
        return Region();
    return Region(int32_t(t.xMin), int32_t(t.yMin), int32_t(t.xMax) + 1, int32_t(t.yMax) + 1);
}

}  // namespace ox
