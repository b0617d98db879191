#include "shading/trace.h"

#include "raytrace/complete_grid.h"
#include "shading/shader.h"

namespace ox {

Color environmentColor(const ShadingContext &ctx) {
    if (!ctx.scene) return Color::black();
    const EnvironmentShaderInterface *env =
        ctx.isGIRay() ? ctx.scene->giEnvironment : ctx.scene->rtEnvironment;
    return env ? env->evaluate(ctx) : Color::black();
}

Color traceSecondary(ShadingContext &child, const Vec3 &origin, const Vec3 &direction) {
    child.rayOrigin = origin;
    child.rayDirection = direction;
    child.rayDistance = -1.0f;
    const ShadingScene *scene = child.scene;
    if (!scene || !scene->ads || !scene->resolver) return environmentColor(child);
    Ray ray;
    ray.origin = origin;
    ray.direction = direction;
    ray.type = child.rayType;
    Hit hit;
    if (!scene->ads->intersect(ray, hit, child.rays)) return environmentColor(child);
    child.rayDistance = hit.t;
    child.position = origin + direction * hit.t;
    child.hasVertexColor = false;
    child.backSide = false;
    child.useSceneLights();
    const SurfaceShaderInterface *shader = scene->resolver->resolve(ray, hit, child);
    if (!shader) return Color::black();
    return shader->shade(child);
}

}  // namespace ox
