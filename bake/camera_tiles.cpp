#include "bake/camera_tiles.h"

#include <algorithm>
#include <vector>

#include "raytrace/camera.h"
#include "raytrace/complete_grid.h"
#include "raytrace/instance.h"
#include "raytrace/surface_point.h"
#include "render/frame.h"
#include "render/tile_renderer.h"
#include "scene/scene.h"
#include "shading/material.h"
#include "shading/pass.h"
#include "shading/trace.h"

namespace ox {
namespace {

/// One render thread's sample shader: camera ray, closest hit, surface point, pass.
struct CameraSampleShader {
    const CameraTileScene *scene = nullptr;
    const RenderPass *pass = nullptr;
    float invWidth = 1.0f, invHeight = 1.0f;
    ShadingContext ctx;
    RayCounter rays;

    ImageSample shade(float x, float y, Vec2 lens, float time) {
        Ray ray;
        scene->camera->generateRay(Vec2{x * invWidth, y * invHeight}, lens, ray);
        ray.time = time;
        ctx.beginSample(ray.origin, ray.direction, kRayPrimary);
        ctx.time = time;
        Hit hit;
        ImageSample sample;
        if (ray.type == kRayEnvironment || !scene->grid->intersect(ray, hit, &rays)) {
            // The environment shows through; the pixel stays transparent.
            sample.color = environmentColor(ctx);
            sample.color.a = 0.0f;
            return sample;
        }
        const auto &instances = scene->scene->instances();
        const float distance = hit.t * ray.direction.length();
        sample.color = Color(0.0f, 0.0f, 0.0f, 1.0f);
        if (hit.instance < instances.size() &&
            surfacePoint(ray, hit, *instances[hit.instance], ctx.surface, scene->grid)) {
            if (const Material *material = materialOf(ctx.surface.material)) {
                ctx.rayDistance = distance;
                sample.color = pass->shade(ctx, material->surface());
                sample.color.a = 1.0f;
            }
        }
        sample.depth = distance;
        sample.object = int32_t(hit.instance);
        return sample;
    }

    int32_t object(float x, float y) {
        Ray ray;
        scene->camera->generateRay(Vec2{x * invWidth, y * invHeight}, Vec2{0.5f, 0.5f}, ray);
        Hit hit;
        if (ray.type == kRayEnvironment || !scene->grid->intersect(ray, hit, &rays)) return -1;
        return int32_t(hit.instance);
    }
};

/// The tile run of one pass: per-thread shaders, scratch and tile buffers.
class CameraTiles final : public TileRenderer {
public:
    CameraTiles(const CameraTileScene &scene, const RenderPass &pass, Frame &frame,
                const std::string &layer)
        : scene_(scene), pass_(pass), frame_(frame), layer_(layer) {}

    RayCounter rays;
    ImageSampler::Counters samples;

protected:
    bool prepare(int threadCount) override {
        threads_.clear();
        threads_.resize(size_t(threadCount));
        for (Thread &t : threads_) {
            CameraSampleShader &s = t.shader;
            s.scene = &scene_;
            s.pass = &pass_;
            s.invWidth = 1.0f / float(frame_.width());
            s.invHeight = 1.0f / float(frame_.height());
            s.ctx.scene = scene_.shading;
            s.ctx.rays = &s.rays;
        }
        return true;
    }

    bool renderTile(int threadIndex, const Tile &tile) override {
        Thread &t = threads_[size_t(threadIndex)];
        t.shader.ctx.random = &tileRandom(threadIndex);
        const size_t n = size_t(tile.width()) * tile.height();
        t.beauty.resize(n);
        t.depth.resize(n);
        scene_.sampler->renderTile(tile.xMin, tile.xMax, tile.yMin, tile.yMax, t.shader, t.scratch,
                                   t.beauty.data(), t.depth.data());
        const Region region(int32_t(tile.xMin), int32_t(tile.yMin), int32_t(tile.xMax) + 1,
                            int32_t(tile.yMax) + 1);
        return frame_.pasteRegion(layer_, region, t.beauty.data()) &&
               frame_.pasteRegion("Z", region, t.depth.data());
    }

    void threadFinished(int threadIndex) override {
        Thread &t = threads_[size_t(threadIndex)];
        rays.merge(t.shader.rays);
        samples.merge(t.scratch.counters);
    }

    void release() override { threads_.clear(); }

private:
    // Each thread's state on cache lines of its own: the shading context, the ray counters and
    // the sampler's pixel stamp are written for every sample, and a line shared with the
    // neighbouring thread's state would bounce between the cores.
    struct alignas(64) Thread {
        CameraSampleShader shader;
        ImageSampler::Scratch scratch;
        std::vector<Color> beauty;
        std::vector<float> depth;
    };

    const CameraTileScene &scene_;
    const RenderPass &pass_;
    Frame &frame_;
    const std::string &layer_;
    std::vector<Thread> threads_;
};

}  // namespace

bool renderCameraTiles(const CameraTileRun &run, const CameraTileScene &scene,
                       const RenderPass &pass, Frame &frame, const std::string &layer,
                       RenderIOInterface &io, RayCounter &rays, ImageSampler::Counters &samples) {
    TileRunSettings settings;
    settings.xMin = run.xMin;
    settings.xMax = run.xMax;
    settings.yMin = run.yMin;
    settings.yMax = run.yMax;
    settings.tileWidth = run.tileWidth;
    settings.tileHeight = run.tileHeight;
    settings.scheme = run.scheme;
    settings.threadCount = run.threadCount;
    CameraTiles tiles(scene, pass, frame, layer);
    const bool ok = tiles.run(settings, io);
    rays.merge(tiles.rays);
    samples.merge(tiles.samples);
    return ok;
}

}  // namespace ox
