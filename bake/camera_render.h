#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "bake/camera_tiles.h"
#include "bake/render_run.h"
#include "render/image_sampler.h"
#include "shading/pass.h"
#include "shading/shading_context.h"

/// The camera render: the image sampler over the tile renderer, primary rays from the scene's
/// camera, shading through the materials, lights and passes, into the layers "beauty" (named
/// by the pass) and "Z" of a frame of the configured resolution.
namespace ox {

class Camera;
class CompleteGrid;
class OXConfigBase;
class Scene;
class SceneShading;

/// The settings of the image sampler from the antialiasing and render settings; lensSamples
/// from the camera's lens (0 without depth of field).
ImageSamplerSettings imageSamplerSettings(const OXConfigBase &config, uint32_t lensSamples);

/// The camera render run (one target: the camera).
class CameraRender final : public HLRenderInterface {
public:
    /// Renders scene through grid with config (all three outlive the run) on threads threads.
    CameraRender(const Scene &scene, const CompleteGrid &grid, const OXConfigBase &config,
                 int64_t threads);
    ~CameraRender() override;

    int32_t prepare(const std::vector<std::string> &passes) override;
    int32_t targetCount() const override { return 1; }
    std::string targetName(int32_t) const override;
    int32_t setupTarget(int32_t index) override;
    Vec2i frameSize() const override;
    Frame *frame() override { return frame_.get(); }
    int32_t renderTarget(int32_t pass, RenderIOInterface &io) override;
    void statistics(RunStatistics &statistics) override;

    /// The camera chosen by prepare (null before).
    const Camera *camera() const { return camera_; }

private:
    const Scene &scene_;
    const CompleteGrid &grid_;
    const OXConfigBase &config_;
    int64_t threads_;
    const Camera *camera_ = nullptr;
    std::unique_ptr<ImageSampler> sampler_;
    std::unique_ptr<SceneShading> shading_;
    RenderPassSet passSet_;
    std::vector<RenderPass *> passes_;
    std::vector<std::string> passNames_;
    std::unique_ptr<Frame> frame_;
    Region region_;
    RayCounter rays_;
    ImageSampler::Counters samples_, runSamples_;
    bool reportedEnd_ = false;
};

}  // namespace ox
