#include "bake/camera_render.h"

#include <algorithm>
#include <cmath>

#include "config/ox_config.h"
#include "config/settings_checks.h"
#include "core/message.h"
#include "raytrace/camera.h"
#include "raytrace/complete_grid.h"
#include "render/frame.h"
#include "scene/scene.h"
#include "scene/shading_setup.h"

namespace ox {

ImageSamplerSettings imageSamplerSettings(const OXConfigBase &config, uint32_t lensSamples) {
    const AASettingsBase &aa = config.AASettings;
    ImageSamplerSettings s;
    s.samplingMode = aa.samplingMode.value();
    s.minSampleRate = aa.minSampleRate();
    s.maxSampleRate = aa.maxSampleRate();
    s.contrast = aa.contrast();
    s.edgeTracing = aa.edgeTracing();
    s.hardEdges = aa.hardEdges();
    s.clamp = aa.clamp();
    s.minValue = aa.minValue();
    s.maxValue = aa.maxValue();
    s.filter = aa.filter.value();
    s.filterSize = aa.filterSize();
    const bool motion = config.RenderSettings.motionBlur.value() != 0;
    s.motionSamples = motion ? std::max(1u, aa.timeSamples()) : 0u;
    s.lensSamples = lensSamples;
    return s;
}

CameraRender::CameraRender(const Scene &scene, const CompleteGrid &grid, const OXConfigBase &config,
                           int64_t threads)
    : scene_(scene), grid_(grid), config_(config), threads_(std::max<int64_t>(1, threads)) {}

CameraRender::~CameraRender() = default;

int32_t CameraRender::prepare(const std::vector<std::string> &passes) {
    // The camera: the one named, else the scene's first.
    const std::string &wanted = config_.FrameSettings.cameraName();
    camera_ = scene_.findCamera(wanted);
    if (!camera_) {
        if (scene_.cameras().empty()) {
            message(kMsgError, 6, "The scene has no camera to render with (cameraName '%s').",
                    wanted.c_str());
            return kRunHardError;
        }
        camera_ = scene_.cameras().front().get();
        message(kMsgWarning, 6, "Camera '%s' not found in the scene, rendering with camera '%s'.",
                wanted.c_str(), camera_->name().c_str());
    }
    // The passes.
    passNames_ = passes;
    passes_.clear();
    for (const std::string &name : passes) {
        RenderPass *pass = passSet_.find(name);
        if (!pass) {
            message(kMsgError, 6, "The pass '%s' cannot be rendered by a camera render.",
                    name.c_str());
            return kRunHardError;
        }
        passes_.push_back(pass);
    }
    if (config_.GISettings.enableGI())
        message(kMsgWarning, 6,
                "Global illumination is not available in this build: rendering direct light "
                "only.");
    // What shading reads, shared by every thread.
    const RenderSettingsBase &render = config_.RenderSettings;
    ShadingSettings settings;
    settings.maxRayDepth = render.maxRayDepth();
    settings.reflectionDepth = render.reflectionDepth();
    settings.refractionDepth = render.refractionDepth();
    settings.transparencyDepth = render.transparencyDepth();
    settings.giTransparencyDepth = render.giTransparencyDepth();
    settings.shadowDepth = render.shadowDepth();
    settings.reflectionThreshold = render.reflectionThreshold();
    settings.refractionThreshold = render.refractionThreshold();
    settings.ignoreLightLinks = render.ignoreLightLinks();
    shading_ = std::make_unique<SceneShading>(scene_, &grid_, settings, render.minShadowRays(),
                                              render.maxShadowRays());
    // The image sampler.
    sampler_ = createImageSampler(imageSamplerSettings(
        config_, camera_->lensSwitch() != 0 ? config_.AASettings.dofSamples() : 0u));
    sampler_->reportSetup();
    return kRunDone;
}

std::string CameraRender::targetName(int32_t) const { return camera_ ? camera_->name() : ""; }

Vec2i CameraRender::frameSize() const {
    return frame_ ? Vec2i{frame_->width(), frame_->height()} : Vec2i{};
}

int32_t CameraRender::setupTarget(int32_t) {
    const Vec2i resolution = config_.FrameSettings.resolution();
    if (frame_ && frame_->width() == resolution.x && frame_->height() == resolution.y)
        return kRunDone;
    frame_ = std::make_unique<Frame>(resolution.x, resolution.y);
    region_ = renderRegion(config_.FrameSettings);
    if (!frame_->addTiledLayer<float>("Z")) return kRunHardError;
    // Pixels outside the render region show nothing.
    std::vector<float> none(size_t(std::max(resolution.x, 0)), -1.0f);
    for (int32_t y = 0; y < resolution.y; ++y)
        if (!frame_->pasteRegion("Z", Region(0, y, resolution.x, y + 1), none.data()))
            return kRunHardError;
    return kRunDone;
}

int32_t CameraRender::renderTarget(int32_t pass, RenderIOInterface &io) {
    if (!frame_ || pass < 0 || size_t(pass) >= passes_.size()) return kRunHardError;
    const std::string &layer = passNames_[size_t(pass)];
    if (!frame_->getColorLayer(layer) && !frame_->addTiledLayer<Color>(layer)) return kRunHardError;
    if (region_.isEmpty()) return kRunDone;
    const FrameSettingsBase &f = config_.FrameSettings;
    CameraTileRun tiles;
    tiles.xMin = uint32_t(region_.xMin);
    tiles.xMax = uint32_t(region_.xMax - 1);
    tiles.yMin = uint32_t(region_.yMin);
    tiles.yMax = uint32_t(region_.yMax - 1);
    tiles.tileWidth = f.tileSize().x;
    tiles.tileHeight = f.tileSize().y;
    tiles.scheme = f.tileScheme.value();
    tiles.threadCount = int32_t(std::min<int64_t>(threads_, 1024));
    const CameraTileScene scene{&scene_, &grid_, camera_, sampler_.get(), &shading_->scene()};
    RayCounter rays;
    ImageSampler::Counters samples;
    io.setProgressTitle("Rendering " + layer);
    const bool ok =
        renderCameraTiles(tiles, scene, *passes_[size_t(pass)], *frame_, layer, io, rays, samples);
    io.finish();
    rays_.merge(rays);
    samples_.merge(samples);
    runSamples_.merge(samples);
    if (size_t(pass) + 1 == passes_.size() && !reportedEnd_) {
        sampler_->reportEnd(runSamples_);
        reportedEnd_ = true;
    }
    return ok ? kRunDone : kRunHardError;
}

void CameraRender::statistics(RunStatistics &statistics) {
    for (int type = 0; type < kRayTypeCount; ++type)
        if (rays_.count(type) > 0)
            statistics.count(std::string(rayTypeName(type)) + " rays", rays_.count(type));
    statistics.count("Image samples", samples_.samples);
    if (samples_.probes > 0) statistics.count("Edge probes", samples_.probes);
    rays_ = RayCounter();
    samples_ = ImageSampler::Counters();
}

}  // namespace ox
