#include "shading/shader.h"

#include "shading/shading_context.h"

namespace ox {

Color SurfaceShaderInterface::shadow(ShadingContext &) const { return Color::white(); }

Color SurfaceShaderInterface::transmission(ShadingContext &) const { return Color::black(); }

Color SurfaceShaderInterface::albedo(ShadingContext &) const { return Color::black(); }

Color EnvironmentShaderInterface::evaluate(const ShadingContext &ctx) const {
    return evaluateDirection(ctx.rayDirection) * ctx.colorWeight;
}

}  // namespace ox
