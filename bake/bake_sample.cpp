#include "bake/bake_sample.h"

#include <algorithm>
#include <cmath>

#include "raytrace/instance.h"
#include "raytrace/render_stats.h"

namespace ox {
namespace {

/// Any unit vector orthogonal to n.
Vec3 anyTangent(const Vec3 &n) {
    const Vec3 axis = std::fabs(n.x) < 0.9f ? Vec3{1, 0, 0} : Vec3{0, 1, 0};
    return cross(axis, n).normalize();
}

}  // namespace

void fillBakeSurface(const ResolvedBakeShape &s, uint32_t triangle, float b1, float b2,
                     int32_t tangentUvSet, BakeSurface &out) {
    const Instance &inst = *s.instance;
    const Shape &shape = inst.shape();
    const VertexList &vl = shape.vertices();
    const Triangle &tri = shape.triangles()[triangle];
    const float b0 = 1.0f - b1 - b2;
    const uint32_t i0 = tri.v[0], i1 = tri.v[1], i2 = tri.v[2];

    const Vec3 p = vl.position(i0) * b0 + vl.position(i1) * b1 + vl.position(i2) * b2;
    out.position = inst.objectToWorld().transformPoint(p);
    out.geometricNormal = inst.normalToWorld(shape.faceNormal(triangle)).normalize();
    Vec3 n = (vl.normal(i0) * b0 + vl.normal(i1) * b1 + vl.normal(i2) * b2);
    n = inst.normalToWorld(n).normalize();
    if (!inst.hasFlag(kFlagSmoothShading) || n.lengthSquared() == 0.0f) n = out.geometricNormal;
    // The shading normal lies on the side the winding names as front.
    if (dot(n, out.geometricNormal) < 0.0f) n = -n;
    out.normal = n;

    const uint32_t sets = std::min<uint32_t>(vl.uvSetCount(), BakeSurface::kMaxUvSets);
    out.uvSetCount = sets;
    for (uint32_t k = 0; k < sets; ++k) {
        const VertexSet<Vec2> uv = vl.uvSet(int(k));
        out.uv[k] = uv[i0] * b0 + uv[i1] * b1 + uv[i2] * b2;
    }

    const int32_t frameSet = tangentUvSet >= 0 ? tangentUvSet : s.uvSet;
    Vec3 t{}, b{};
    if (frameSet >= 0 && uint32_t(frameSet) < vl.uvSetCount()) {
        const VertexSet<Vec3> ts = vl.tangentSet(frameSet), bs = vl.bitangentSet(frameSet);
        t = inst.objectToWorld().transformVector(ts[i0] * b0 + ts[i1] * b1 + ts[i2] * b2);
        b = inst.objectToWorld().transformVector(bs[i0] * b0 + bs[i1] * b1 + bs[i2] * b2);
    }
    t = t - n * dot(t, n);
    if (t.lengthSquared() < 1e-12f)
        t = anyTangent(n);
    else
        t.normalize();
    // The bitangent keeps the direction of the set (handedness is the mesh's).
    Vec3 bt = cross(n, t);
    if (dot(bt, b) < 0.0f) bt = -bt;
    out.tangent = t;
    out.bitangent = bt;

    out.hasColor = vl.hasColors();
    out.color = out.hasColor ? vl.color(i0) * b0 + vl.color(i1) * b1 + vl.color(i2) * b2 : Color{};
    out.instance = &inst;
    out.instanceIndex = s.instanceIndex;
    out.triangle = triangle;
    out.flipped = false;
}

void applyEdgeBias(const Vec2 c[3], float bias, float &b1, float &b2) {
    if (!(bias > 0.0f)) return;
    const float area2 =
        std::fabs((c[1].x - c[0].x) * (c[2].y - c[0].y) - (c[1].y - c[0].y) * (c[2].x - c[0].x));
    if (!(area2 > 0.0f)) return;
    // Barycentric i is the distance to the opposite edge over the altitude (area2 / edge).
    float b[3] = {1.0f - b1 - b2, b1, b2};
    float minB[3];
    for (int i = 0; i < 3; ++i) {
        const Vec2 e = c[(i + 2) % 3] - c[(i + 1) % 3];
        const float edge = std::sqrt(e.x * e.x + e.y * e.y);
        minB[i] = std::min(1.0f / 3.0f, bias * edge / area2);
    }
    // Blend towards the centroid just far enough that every barycentric reaches its minimum.
    float s = 0.0f;
    for (int i = 0; i < 3; ++i)
        if (b[i] < minB[i]) s = std::max(s, (minB[i] - b[i]) / (1.0f / 3.0f - b[i]));
    s = std::clamp(s, 0.0f, 1.0f);
    for (float &v : b) v += (1.0f / 3.0f - v) * s;
    b1 = b[1], b2 = b[2];
}

bool applyNormalDirection(BakeSurface &s, int32_t normalDirection, bool viewDependent,
                          const Vec3 &eye) {
    float f = -dot(s.normal, s.position - eye);
    bool flip = false;
    if (normalDirection == int32_t(NormalDirectionType::Back))
        flip = true;
    else if (normalDirection == int32_t(NormalDirectionType::Camera))
        flip = f < 0.0f;
    if (flip) {
        s.normal = -s.normal;
        s.geometricNormal = -s.geometricNormal;
        s.tangent = -s.tangent;
        s.bitangent = -s.bitangent;
        s.flipped = true;
        f = -f;
    }
    return !(viewDependent && f < -0.001f);
}

}  // namespace ox
