#pragma once

#include <memory>
#include <string>
#include <vector>

#include "app/camera_bake_driver.h"
#include "app/frame_writer.h"

/// The runs of this build over a loaded scene: the scene, its acceleration structure, the
/// camera render, and the image writers.
namespace ox {

class CompleteGrid;
class RenderWorld;
class Scene;

/// RenderRunFactoryInterface over the scene loader, the grid, the camera render, the texture
/// bake and the image output. Surface transfers arrive with their own run.
class SceneRunFactory final : public RenderRunFactoryInterface {
public:
    SceneRunFactory();
    ~SceneRunFactory() override;

    bool supports(int32_t action) const override;
    bool loadScene(const std::vector<std::string> &inputs, OXConfig &config, int64_t threads,
                   std::string &error) override;
    bool packUVs(OXConfig &config, bool &changed, std::string &error) override;
    std::unique_ptr<HLRenderInterface> createRun(int32_t action, const OXConfig &config,
                                                 int64_t threads) override;
    TargetWriterInterface &writer() override { return writer_; }

private:
    FrameTargetWriter writer_;
    std::unique_ptr<Scene> scene_;
    std::unique_ptr<CompleteGrid> grid_;
    std::unique_ptr<RenderWorld> world_;
};

}  // namespace ox
