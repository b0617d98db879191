// The camera render's choice of camera and passes, and its sampler settings.
#include "bake/camera_render.h"

#include <gtest/gtest.h>

#include "config/ox_config.h"
#include "raytrace/camera.h"
#include "raytrace/complete_grid.h"
#include "scene/scene.h"

namespace {

using testing::internal::CaptureStdout;
using testing::internal::GetCapturedStdout;

std::unique_ptr<ox::Camera> camera(const std::string &name) {
    return std::make_unique<ox::PerspectiveCamera>(name, ox::Mtx4(), nullptr, 1.0f, 1.0f,
                                                   ox::Vec2{0.0f, 0.0f});
}

TEST(CameraRender, RendersTheNamedCameraOrTheScenesFirst) {
    ox::Scene scene;
    ox::CompleteGrid grid;
    ox::OXConfig config;
    auto prepare = [&](const std::vector<std::string> &passes, std::string &out) {
        ox::CameraRender run(scene, grid, config, 2);
        CaptureStdout();
        const int32_t r = run.prepare(passes);
        out = GetCapturedStdout();
        return std::make_pair(r, run.camera() ? run.camera()->name() : std::string());
    };
    std::string out;
    EXPECT_EQ(prepare({"beauty"}, out).first, ox::kRunHardError);
    EXPECT_NE(out.find("[ERROR]    The scene has no camera to render with (cameraName 'persp')."),
              std::string::npos)
        << out;

    scene.addCamera(camera("front"));
    scene.addCamera(camera("side"));
    EXPECT_EQ(prepare({"beauty"}, out),
              std::make_pair(int32_t(ox::kRunDone), std::string("front")));
    EXPECT_NE(out.find("[WARNING]  Camera 'persp' not found in the scene, rendering with camera "
                       "'front'."),
              std::string::npos);
    config.FrameSettings.cameraName = std::string("side");
    EXPECT_EQ(prepare({"beauty"}, out), std::make_pair(int32_t(ox::kRunDone), std::string("side")));
    EXPECT_EQ(out.find("[WARNING]"), std::string::npos);
    EXPECT_EQ(prepare({"nope"}, out).first, ox::kRunHardError);
    EXPECT_NE(out.find("The pass 'nope' cannot be rendered"), std::string::npos);
}

TEST(CameraRender, SamplerSettingsComeFromTheAntialiasingSettings) {
    ox::OXConfig config;
    // Plain copies are not repeated here; the enumerations and the motion samples are mapped.
    config.AASettings.samplingMode.set(ox::SamplingType::SuperSampling);
    config.AASettings.filter.set(ox::FilterType::Mitchell);
    config.AASettings.timeSamples = 5u;
    ox::ImageSamplerSettings s = ox::imageSamplerSettings(config, 9);
    EXPECT_EQ(s.samplingMode, 2);
    EXPECT_EQ(s.filter, int32_t(ox::FilterKind::kMitchell));
    EXPECT_EQ(s.motionSamples, 0u);  // motion blur is off
    EXPECT_EQ(s.lensSamples, 9u);
    config.RenderSettings.motionBlur.set(ox::MotionBlurMode::Blur3D);
    EXPECT_EQ(ox::imageSamplerSettings(config, 0).motionSamples, 5u);
}

}  // namespace
