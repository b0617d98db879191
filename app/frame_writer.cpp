#include "app/frame_writer.h"

#include "app/command_line.h"
#include "render/color_correction.h"
#include "render/frame.h"
#include "render/image_writer.h"
#include "render/post_filter.h"

namespace ox {

static_assert(int32_t(kFormatExr) == kSaveEXR && int32_t(kFormatJpeg) == kSaveJPEG &&
              int32_t(kFormatTga) == kSaveTGA32 && int32_t(kFormatTga24) == kSaveTGA24);

bool FrameTargetWriter::writeLayer(Frame *frame, int32_t format, const std::string &directory,
                                   const std::string &baseName, const std::string &target,
                                   const std::string &layer, const OXConfigBase &config) {
    if (!frame) return true;
    // The command line's formats number the save kinds alike (1 EXR ... 5 TGA without alpha).
    const OutputCorrectionBase &out = config.FrameSettings.outputCorrection;
    const auto correction = createColorCorrection(out.colorCorrection(), out.gamma());
    return saveLayer(format, baseName, target, layer, *frame, *correction,
                     config.FrameSettings.dither(), directory);
}

bool FrameTargetWriter::writeMultiLayer(Frame *frame, const std::string &file,
                                        const OXConfigBase &config) {
    return !frame || writeMultiLayerEXR(file, *frame, config.FrameSettings.alphaChannel());
}

bool FrameTargetWriter::writeMinMaxData(Frame *, const std::string &file) {
    // Only normalised bakes have minimum and maximum data.
    const MinMaxData *data = run_ ? run_->minMaxData() : nullptr;
    return !data || ox::writeMinMaxData(file, *data);
}

}  // namespace ox
