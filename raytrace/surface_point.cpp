#include "raytrace/surface_point.h"

#include <algorithm>
#include <cmath>

#include "raytrace/complete_grid.h"
#include "raytrace/instance.h"
#include "raytrace/motion_blur.h"

namespace ox {

namespace {

// The unit vector along v, or zero when v has no usable length.
Vec3 unitOrZero(const Vec3 &v) {
    float l2 = v.lengthSquared();
    return l2 > 0.0f && std::isfinite(l2) ? v * (1.0f / std::sqrt(l2)) : Vec3();
}

// Change of the hit position per unit image step, for a ray whose origin and direction change
// by dO and dD: the differential ray meets the triangle's plane (normal n) at t + dt.
Vec3 positionDifferential(const Ray &ray, float t, const Vec3 &n, const Vec3 &dO, const Vec3 &dD) {
    float dn = dot(ray.direction, n);
    if (dn == 0.0f) return Vec3();
    Vec3 dp = dO + dD * t;
    return dp - ray.direction * (dot(dp, n) / dn);
}

// Any unit vector orthogonal to the unit vector n.
Vec3 anyOrthogonal(const Vec3 &n) {
    Vec3 a = std::fabs(n.x) < 0.6f ? Vec3(1, 0, 0) : Vec3(0, 1, 0);
    return unitOrZero(a - n * dot(a, n));
}

}  // namespace

SurfaceUv surfaceUv(const SurfacePoint &point, uint32_t k) {
    SurfaceUv out;
    if (!point.instance) return out;
    const VertexList &list = point.instance->shape().vertices();
    if (k >= list.uvSetCount()) return out;
    const float w0 = 1.0f - point.u - point.v, w1 = point.u, w2 = point.v;
    const uint32_t *c = point.corners;
    VertexSet<Vec2> uv = list.uvSet(int(k));
    Vec2 uv0 = uv[c[0]], uv1 = uv[c[1]], uv2 = uv[c[2]];
    out.uv = uv0 * w0 + uv1 * w1 + uv2 * w2;
    Vec2 d1 = uv1 - uv0, d2 = uv2 - uv0;
    out.dUVdx = d1 * point.dudx + d2 * point.dvdx;
    out.dUVdy = d1 * point.dudy + d2 * point.dvdy;
    VertexSet<Vec3> ts = list.tangentSet(int(k)), bs = list.bitangentSet(int(k));
    const Mtx4 &m = point.instance->objectToWorld();
    out.tangent = unitOrZero(m.transformVector(ts[c[0]] * w0 + ts[c[1]] * w1 + ts[c[2]] * w2));
    out.bitangent = unitOrZero(m.transformVector(bs[c[0]] * w0 + bs[c[1]] * w1 + bs[c[2]] * w2));
    return out;
}

bool surfacePoint(const Ray &ray, const Hit &hit, const Instance &instance, SurfacePoint &point,
                  const CompleteGrid *grid) {
    if (!hit.found()) return false;
    const Shape &shape = instance.shape();
    const VertexList &list = shape.vertices();
    if (hit.id >= shape.triangleCount()) return false;
    const Triangle &tri = shape.triangles()[hit.id];
    for (uint32_t corner : tri.v)
        if (corner >= list.size()) return false;
    if (hit.moving && (!grid || !hit.primitive)) return false;

    SurfacePoint p;
    p.instance = &instance;
    p.instanceIndex = hit.instance;
    p.flags = instance.flags();
    p.triangle = hit.id;
    p.corners[0] = tri.v[0], p.corners[1] = tri.v[1], p.corners[2] = tri.v[2];
    p.material = instance.material(hit.id);
    p.moving = hit.moving;
    p.u = hit.u, p.v = hit.v;
    const float w0 = 1.0f - hit.u - hit.v, w1 = hit.u, w2 = hit.v;

    // World corners: the placed shape triangle, or the moving triangle at the ray's time.
    const Mtx4 &toWorld = instance.objectToWorld();
    Vec3 c[3];
    if (hit.moving) {
        const auto &mt = *static_cast<const MotionTriangle *>(hit.primitive);
        MotionHitInterpolator::cornersAt(&grid->motionCorners(mt), mt.steps,
                                         MotionBlurHandler::clampTime(ray.time), c);
    } else {
        for (int k = 0; k < 3; ++k) c[k] = toWorld.transformPoint(list.position(tri.v[k]));
    }
    p.position = c[0] * w0 + c[1] * w1 + c[2] * w2;

    // The plane through the world corners; its winding turns with a mirroring placement, the
    // front stays the object's.
    Vec3 e1 = c[1] - c[0], e2 = c[2] - c[0];
    Vec3 n = cross(e1, e2);
    p.geometricNormal = unitOrZero(instance.mirrors() ? -n : n);
    p.backSide = dot(ray.direction, p.geometricNormal) > 0.0f;

    Vec3 shading;
    if (instance.hasFlag(kFlagSmoothShading))
        shading = unitOrZero(instance.normalToWorld(
            list.normal(tri.v[0]) * w0 + list.normal(tri.v[1]) * w1 + list.normal(tri.v[2]) * w2));
    p.normal = shading.lengthSquared() > 0.0f ? shading : p.geometricNormal;

    // Ray differentials: the position's change per image unit on the triangle's plane, then the
    // barycentrics' change, solving dP = du e1 + dv e2.
    p.dPdx = positionDifferential(ray, hit.t, n, ray.dOdx, ray.dDdx);
    p.dPdy = positionDifferential(ray, hit.t, n, ray.dOdy, ray.dDdy);
    float n2 = n.lengthSquared();
    if (n2 > 0.0f && std::isfinite(n2)) {
        Vec3 a = cross(e2, n) * (1.0f / n2), b = cross(n, e1) * (1.0f / n2);
        p.dudx = dot(p.dPdx, a), p.dvdx = dot(p.dPdx, b);
        p.dudy = dot(p.dPdy, a), p.dvdy = dot(p.dPdy, b);
    }

    if (list.hasColors())
        p.color = list.color(tri.v[0]) * w0 + list.color(tri.v[1]) * w1 + list.color(tri.v[2]) * w2;

    p.uvSetCount = std::min<uint32_t>(list.uvSetCount(), SurfacePoint::kMaxUvSets);
    for (uint32_t k = 0; k < p.uvSetCount; ++k) p.uvs[k] = surfaceUv(p, k);

    // The shading frame from UV set 0's tangent; the bitangent keeps its set's side.
    Vec3 t = p.uvSetCount
                 ? unitOrZero(p.uvs[0].tangent - p.normal * dot(p.normal, p.uvs[0].tangent))
                 : Vec3();
    if (t.lengthSquared() == 0.0f) t = anyOrthogonal(p.normal);
    Vec3 b = cross(p.normal, t);
    if (p.uvSetCount && dot(b, p.uvs[0].bitangent) < 0.0f) b = -b;
    p.tangent = t, p.bitangent = b;

    point = p;
    return true;
}

}  // namespace ox
