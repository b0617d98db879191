#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "app/run_driver.h"
#include "bake/render_run.h"
#include "config/ox_config.h"

/// The camera/bake driver (camera render, texture bake, surface transfer), the split of a
/// configuration, and the helpers they share: file-name checks and configuration writing.
namespace ox {

/// Writes what a run rendered into its frame; the image output implements it.
class TargetWriterInterface {
public:
    virtual ~TargetWriterInterface() = default;
    /// Writes layer of frame as one image in format (EXR, JPEG, TGA) named from directory,
    /// baseName, target and layer; false after one error message.
    virtual bool writeLayer(Frame *frame, int32_t format, const std::string &directory,
                            const std::string &baseName, const std::string &target,
                            const std::string &layer, const OXConfigBase &config) = 0;
    /// Writes every layer of frame into the multi-layer EXR file; false after one message.
    virtual bool writeMultiLayer(Frame *frame, const std::string &file,
                                 const OXConfigBase &config) = 0;
    /// Writes the frame's "MinMaxData" as XML to file when it has any; false after one
    /// message when writing failed.
    virtual bool writeMinMaxData(Frame *frame, const std::string &file) = 0;
};

/// What the camera/bake driver builds its runs from: the scene, the run kinds, the writers.
class RenderRunFactoryInterface {
public:
    virtual ~RenderRunFactoryInterface() = default;
    /// True when this build can run action.
    virtual bool supports(int32_t action) const = 0;
    /// Loads the scene of inputs with the settings of config (which the load may change: the
    /// automatic bias); false with the loader's message in error.
    virtual bool loadScene(const std::vector<std::string> &inputs, OXConfig &config,
                           int64_t threads, std::string &error) = 0;
    /// Packs the light-map UVs of a surface transfer into config; false with the message in
    /// error. changed tells whether config was changed.
    virtual bool packUVs(OXConfig &config, bool &changed, std::string &error) = 0;
    /// The run of action over the loaded scene; config outlives the run. Null after an error
    /// message when the run cannot be made.
    virtual std::unique_ptr<HLRenderInterface> createRun(int32_t action, const OXConfig &config,
                                                         int64_t threads) = 0;
    /// The writers of the frames.
    virtual TargetWriterInterface &writer() = 0;
};

/// The camera/bake driver of actions 1, 2 and 3.
class CameraBakeDriver final : public RunDriverInterface {
public:
    /// A driver over factory (which outlives it). skipPrepass leaves the GI prepasses out
    /// (the merges run the driver over a finished frame).
    explicit CameraBakeDriver(std::shared_ptr<RenderRunFactoryInterface> factory,
                              bool skipPrepass = false)
        : factory_(std::move(factory)), skipPrepass_(skipPrepass) {}

    int32_t run(int32_t action, RunContext &context) override;
    bool supports(int32_t action) const override { return factory_->supports(action); }

private:
    std::shared_ptr<RenderRunFactoryInterface> factory_;
    bool skipPrepass_;
};

/// The split of a configuration (-spl): one configuration per texture-bake or surface-transfer
/// target, written next to the -x file as its name + "." + index.
class SplitDriver final : public RunDriverInterface {
public:
    int32_t run(int32_t action, RunContext &context) override;
};

/// True when name can be part of an output file name: it holds no "/", "\" or "..". Otherwise
/// reports the error "The <what> '<name>' cannot be part of a file name ..." and returns false.
bool checkFileNamePart(const std::string &name, const char *what);

/// Writes config to file (atomically, so a failure leaves any existing file whole), with the
/// keys the run changes while it runs (GI cache paths, fgUseLegacy, thread count, bias) taken
/// from loaded. Returns the run status: 0, or kStatusFailure after one error message.
int32_t writeRunConfiguration(const std::string &file, const OXConfigBase &config,
                              const OXConfigBase &loaded);

/// The display gamma of the preview from the output colour correction: None 1.0, Gamma the
/// configured gamma, SRGB 2.2; any other value warns and gives 1.0.
float previewGamma(const OutputCorrectionBase &correction);

}  // namespace ox
