#pragma once

#include <string>

#include "app/camera_bake_driver.h"

/// The image output of the camera/bake driver: frames written by the image writers.
namespace ox {

/// TargetWriterInterface over the image writers: one image per target and layer in the
/// command line's format (after the output colour correction for TGA and JPEG), or every layer
/// in one multi-layer EXR file.
class FrameTargetWriter final : public TargetWriterInterface {
public:
    bool writeLayer(Frame *frame, int32_t format, const std::string &directory,
                    const std::string &baseName, const std::string &target,
                    const std::string &layer, const OXConfigBase &config) override;
    bool writeMultiLayer(Frame *frame, const std::string &file,
                         const OXConfigBase &config) override;
    bool writeMinMaxData(Frame *frame, const std::string &file) override;
    /// The run whose normalization records writeMinMaxData writes (null: none).
    void setRun(const HLRenderInterface *run) { run_ = run; }

private:
    const HLRenderInterface *run_ = nullptr;
};

}  // namespace ox
