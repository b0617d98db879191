#include "shading/trace.h"

#include "raytrace/complete_grid.h"
#include "raytrace/surface_point.h"
#include "shading/material.h"
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
    if (!scene || !scene->ads || (!scene->resolver && !scene->instances))
        return environmentColor(child);
    Ray ray;
    ray.origin = origin;
    ray.direction = direction;
    ray.type = child.rayType;
    Hit hit;
    if (!scene->ads->intersect(ray, hit, child.rays)) return environmentColor(child);
    child.rayDistance = hit.t;
    child.useSceneLights();
    const SurfaceShaderInterface *shader = nullptr;
    if (scene->resolver) {
        child.surface = SurfacePoint();
        child.surface.position = origin + direction * hit.t;
        child.surface.instanceIndex = hit.instance;
        shader = scene->resolver->resolve(ray, hit, child);
    } else if (hit.instance < scene->instanceCount && scene->instances[hit.instance] &&
               surfacePoint(ray, hit, *scene->instances[hit.instance], child.surface,
                            scene->grid)) {
        const Material *m = materialOf(child.surface.material);
        shader = m ? &m->surface() : nullptr;
    }
    if (!shader) return Color::black();
    return shader->shade(child);
}

}  // namespace ox
