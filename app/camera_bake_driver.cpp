#include "app/camera_bake_driver.h"

#include <cerrno>
#include <cstring>

#include "app/config_run_settings.h"
#include "app/exit_status.h"
#include "bake/bake_target.h"
#include "config/settings_checks.h"
#include "config/xml.h"
#include "core/message.h"
#include "core/timer.h"
#include "platform/file_system.h"

namespace ox {
namespace {

constexpr int32_t kFgIntegrator = 4;  // LightIntegratorType FinalGather

/// The status of a failed or aborted step; the progress object is aborted so that every
/// worker and the preview stop.
int32_t stopRun(int32_t result, RenderIOInterface &progress) {
    progress.abort();
    return result == kRunHardError ? kStatusFailure : kStatusAborted;
}

/// True when a step ended the run: a non-zero result or an abort.
bool stepFailed(int32_t result, const RenderIOInterface &progress) {
    return result != kRunDone || progress.isAborted();
}

/// The multi-layer EXR file of a target: the base name without ".exr", "_" when non-empty,
/// then the target name.
std::string multiLayerFile(const std::string &directory, std::string baseName,
                           const std::string &target) {
    const std::string ext = ".exr";
    if (baseName.size() >= ext.size() &&
        baseName.compare(baseName.size() - ext.size(), ext.size(), ext) == 0)
        baseName.resize(baseName.size() - ext.size());
    if (!baseName.empty()) baseName += "_";
    return directory + baseName + target + ".exr";
}

/// One camera/bake run from its loaded scene to its last written file.
class CameraBakeRun {
public:
    CameraBakeRun(RenderRunFactoryInterface &factory, RunContext &context, int32_t action,
                  bool skipPrepass)
        : factory_(factory), c_(context), action_(action), skipPrepass_(skipPrepass) {}

    int32_t run();

private:
    int32_t prepassLoop();
    int32_t mainLoop();
    void resizePreview();

    RenderRunFactoryInterface &factory_;
    RunContext &c_;
    int32_t action_;
    bool skipPrepass_;
    OXConfig work_;
    std::unique_ptr<HLRenderInterface> run_;
    std::vector<std::string> passes_;
    std::vector<std::string> targets_;
    PreviewObserverInterface *preview_ = nullptr;
    Timer runTimer_;
    Timer stepTimer_;
};

int32_t CameraBakeRun::run() {
    auto *settings = dynamic_cast<ConfigRunSettings *>(&c_.settings);
    if (!settings) {
        message(kMsgError, 6, "The %s needs the configuration reader, which this build lacks.",
                describeRunAction(action_, c_.options).c_str());
        return kStatusUnsupported;
    }
    if (!factory_.supports(action_)) {
        message(kMsgError, 6, "The %s is not available: this build has no driver for it.",
                describeRunAction(action_, c_.options).c_str());
        return kStatusUnsupported;
    }
    // The working copy takes whatever the scene load changes (the automatic bias), so
    //       that nothing of it reaches the run's configuration.
    copyInto(work_, settings->config());
    std::string error;
    if (!factory_.loadScene(c_.options.inputFiles, work_, c_.renderThreads, error)) {
        message(kMsgError, 6, "%s: %s", error.c_str(),
                c_.options.inputFiles.empty() ? "" : c_.options.inputFiles.front().c_str());
        return kStatusFailure;
    }
    // Surface transfers pack their light-map UVs first.
    if (action_ == kActionSurfaceTransfer) {
        bool changed = false;
        if (!factory_.packUVs(work_, changed, error)) {
            message(kMsgError, 6, "%s", error.c_str());
            return kStatusUvPack;
        }
        if (changed) {
            std::string name = c_.outputBaseName;
            if (name.size() >= 4 && name.compare(name.size() - 4, 4, ".xml") == 0)
                name.resize(name.size() - 4);
            const int32_t status = writeRunConfiguration(c_.outputDirectory + name + ".xml", work_,
                                                         settings->loaded());
            if (status != kStatusSuccess) return status;
        }
    }
    // The preview observer. This build has no preview window, so a shown display gets the
    //    null observer too, with the gamma the window would use.
    if (c_.preview) {
        if (!*c_.preview) {
            const float gamma =
                c_.options.showDisplay ? previewGamma(work_.FrameSettings.outputCorrection) : 1.0f;
            *c_.preview = std::make_unique<NullPreviewObserver>(gamma);
        }
        preview_ = c_.preview->get();
    }
    // The render region, tested per axis: an inverted axis has no area either.
    if (work_.FrameSettings.regionRender() && renderRegion(work_.FrameSettings).isEmpty()) {
        message(kMsgError, 6,
                "Specified render region has no area or lies outside resolution range.");
        return kStatusBadRegionOrImage;
    }
    // The passes and the run.
    run_ = factory_.createRun(action_, work_, c_.renderThreads);
    if (!run_) return kStatusFailure;
    if (action_ == kActionRender) {
        const GISettingsBase &gi = work_.GISettings;
        if (gi.enableGI() && gi.primaryIntegrator.value() == kFgIntegrator && gi.fgAOVisualize()) {
            message(kMsgInfo, 6, "Visualization of Ambient Occlusion is requested.");
            message(kMsgInfo, 6,
                    "A single AO pass will been renderer, all other passes are ignored.");
            passes_ = {"tpAO"};
        } else {
            passes_ = {"beauty"};
        }
    } else {
        passes_ = run_->componentPasses();
        if (passes_.empty()) {
            message(kMsgError, 6, "No valid RenderComponents found in TextureBakeSettings!");
            return kStatusNoComponents;
        }
    }
    for (const std::string &pass : passes_)
        if (!checkFileNamePart(pass, "pass name")) return kStatusFailure;
    // Every bake target's size and name, before anything is baked.
    if (action_ == kActionTextureBake &&
        !validateBakeTargets(work_.TextureBakeSettings, work_.FrameSettings.resolution()))
        return kStatusZeroDimension;
    // Prepare, then check every name that becomes part of a file name before rendering.
    if (const int32_t r = run_->prepare(passes_); stepFailed(r, c_.progress))
        return stopRun(r, c_.progress);
    for (int32_t t = 0; t < run_->targetCount(); ++t) {
        targets_.push_back(run_->targetName(t));
        if (!checkFileNamePart(targets_.back(), "target name")) return kStatusFailure;
    }
    // Images go beside the base name, which may name a directory of its own: it must exist
    // before anything is rendered, not after.
    const std::string baseDirectory =
        FileSystemUtilities::directoryOf(c_.outputDirectory + c_.outputBaseName);
    if (!baseDirectory.empty() && !FileSystemUtilities::createDirectories(baseDirectory)) {
        const int code = FileSystemUtilities::lastError();
        message(kMsgError, 6, "Unable to create the output directory %s: %s", baseDirectory.c_str(),
                code != 0 ? std::strerror(code) : "unknown error");
        return kStatusImageWrite;
    }
    // The GI prepasses, then the passes over the targets (unless GI asks for its prepasses
    // only).
    runTimer_.start(true);
    stepTimer_.start(true);
    if (!skipPrepass_)
        if (const int32_t status = prepassLoop(); status != kStatusSuccess) return status;
    if (!(work_.GISettings.enableGI() && work_.GISettings.renderGIPrepassOnly()))
        if (const int32_t status = mainLoop(); status != kStatusSuccess) return status;
    runTimer_.stop();
    stepTimer_.stop();
    message(kMsgProgress, 6, "Done rendering! Total render time: %s", runTimer_.format().c_str());
    if (c_.options.quitWhenDone) c_.progress.abort();
    return kStatusSuccess;
}

void CameraBakeRun::resizePreview() {
    if (!preview_ || !c_.options.showDisplay) return;
    const Vec2i size = run_->frameSize();
    preview_->resize(size.x, size.y);
}

int32_t CameraBakeRun::prepassLoop() {
    RenderIOInterface &io = c_.progress;
    const int32_t prepasses = run_->prepassCount();
    const int32_t targets = int32_t(targets_.size());
    if (const int32_t r = run_->beginPrepasses(); stepFailed(r, io)) return stopRun(r, io);
    for (int32_t p = 0; p < prepasses; ++p) {
        for (int32_t t = 0; t < targets; ++t) {
            if (io.isAborted()) return stopRun(kRunDone, io);
            message(kMsgInfo, 6, "Rendering prepass %d / %d", t + 1 + p * targets,
                    prepasses * targets);
            int32_t r = run_->setupTarget(t);
            if (r == kRunDone) {
                resizePreview();
                r = run_->giPrepass(p, io);
            }
            if (stepFailed(r, io)) return stopRun(r, io);
            io.clearRelease();
        }
        if (const int32_t r = run_->closePrepass(p); stepFailed(r, io)) return stopRun(r, io);
    }
    if (const int32_t r = run_->endPrepasses(); stepFailed(r, io)) return stopRun(r, io);
    return kStatusSuccess;
}

int32_t CameraBakeRun::mainLoop() {
    RenderIOInterface &io = c_.progress;
    RunStatistics &stats = c_.statistics;
    TargetWriterInterface &writer = factory_.writer();
    const int32_t passCount = int32_t(passes_.size());
    const int32_t targetCount = int32_t(targets_.size());
    run_->keepPassLayers(c_.format == kFormatExrMultiLayer);
    for (int32_t p = 0; p < passCount; ++p) {
        const std::string &pass = passes_[size_t(p)];
        stats.beginPass(pass);
        for (int32_t t = 0; t < targetCount; ++t) {
            if (io.isAborted()) return stopRun(kRunDone, io);
            const std::string &target = targets_[size_t(t)];
            // The step line with the time since the run began.
            stepTimer_.stop();
            message(kMsgInfo, 6,
                    "[%d/%d] Rendering %s [Target %d/%d] [Pass %d/%d], total elapsed time: %s",
                    p * targetCount + t + 1, passCount * targetCount, target.c_str(), t + 1,
                    targetCount, p + 1, passCount, stepTimer_.format().c_str());
            stepTimer_.start();
            // Size the frame, then render.
            stats.beginTarget(target);
            int32_t r = run_->setupTarget(t);
            if (r == kRunDone) {
                resizePreview();
                stats.beginCommand("render");
                r = run_->renderTarget(p, io);
                stats.endCommand();
                run_->statistics(stats);
            }
            stats.endTarget();
            if (stepFailed(r, io)) return stopRun(r, io);
            // The layers of the pass, one file per target and layer.
            const int32_t format = c_.format;
            if (format != kFormatExrMultiLayer && format != kFormatNone) {
                std::vector<std::string> layers = run_->passLayers(p);
                if (layers.empty()) layers.push_back(pass);
                for (const std::string &layer : layers)
                    if (!writer.writeLayer(run_->frame(), format, c_.outputDirectory,
                                           c_.outputBaseName, target, layer, work_))
                        return kStatusImageWrite;
            }
            // The normalisation's minimum and maximum.
            const std::string minMax = c_.outputDirectory + c_.outputBaseName + "_" + target +
                                       (format == kFormatExrMultiLayer ? "" : "_" + pass) + ".xml";
            if (!writer.writeMinMaxData(run_->frame(), minMax)) return kStatusFailure;
            // The step is done.
            if (io.isAborted()) return stopRun(kRunDone, io);
            io.clearRelease();
            // Every layer of every pass in one file, written once after the target's last pass
            // (the run keeps the earlier passes' layers in the target's frame); writing it per
            // pass would leave only the last pass in the file.
            if (format == kFormatExrMultiLayer && p == passCount - 1 &&
                !writer.writeMultiLayer(
                    run_->frame(), multiLayerFile(c_.outputDirectory, c_.outputBaseName, target),
                    work_))
                return kStatusImageWrite;
        }
        stats.endPass();
    }
    return kStatusSuccess;
}

}  // namespace

int32_t CameraBakeDriver::run(int32_t action, RunContext &context) {
    CameraBakeRun run(*factory_, context, action, skipPrepass_);
    return run.run();
}

int32_t SplitDriver::run(int32_t, RunContext &context) {
    const auto *settings = dynamic_cast<const ConfigRunSettings *>(&context.settings);
    if (!settings) {
        message(kMsgError, 6, "Splitting needs the configuration reader, which this build lacks.");
        return kStatusUnsupported;
    }
    const OXConfig &config = settings->loaded();
    const int32_t type = config.FrameSettings.renderType.value();
    const bool texture = type == int32_t(RenderType::TextureBake);
    if (!texture && type != int32_t(RenderType::SurfaceTransfer)) {
        if (type == int32_t(RenderType::VertexTransfer))
            message(kMsgError, 6,
                    "Splitting a VertexTransfer configuration is not available in this build.");
        else
            message(kMsgError, 6,
                    "ERROR: Splitting is not supported for modes other than Vertex Transfer.");
        return kStatusUnsupported;
    }
    if (context.options.configFiles.empty()) {
        message(kMsgError, 6, "Splitting needs the configuration file given with -x.");
        return kStatusFailure;
    }
    const std::string &file = context.options.configFiles.front();
    const size_t count = texture ? config.TextureBakeSettings.targets.size()
                                 : config.SurfaceTransferSettings.targets.size();
    if (count == 0) message(kMsgWarning, 6, "The configuration has no targets to split.");
    for (size_t i = 0; i < count; ++i) {
        OXConfig piece;
        copyInto(piece, config);
        OXCTypeVector &targets =
            texture ? static_cast<OXCTypeVector &>(piece.TextureBakeSettings.targets)
                    : piece.SurfaceTransferSettings.targets;
        const OXCTypeVector &source =
            texture ? static_cast<const OXCTypeVector &>(config.TextureBakeSettings.targets)
                    : config.SurfaceTransferSettings.targets;
        targets.clear();
        targets.add(source.element(i));
        const int32_t status = writeRunConfiguration(file + "." + std::to_string(i), piece, config);
        if (status != kStatusSuccess) return status;
    }
    return kStatusSuccess;
}

bool checkFileNamePart(const std::string &name, const char *what) {
    if (name.find('/') == std::string::npos && name.find('\\') == std::string::npos &&
        name.find("..") == std::string::npos)
        return true;
    message(kMsgError, 6,
            "The %s '%s' cannot be part of a file name: it must not hold '/', '\\' or '..'.", what,
            name.c_str());
    return false;
}

int32_t writeRunConfiguration(const std::string &file, const OXConfigBase &config,
                              const OXConfigBase &loaded) {
    OXConfig out;
    copyInto(out, config);
    // The keys the run rewrites for itself go out as they were read.
    GISettingsBase &gi = out.GISettings;
    const GISettingsBase &loadedGi = loaded.GISettings;
    gi.fgFile = loadedGi.fgFile();
    gi.ptFile = loadedGi.ptFile();
    gi.globalPhotonMapFile = loadedGi.globalPhotonMapFile();
    gi.causticsPhotonMapFile = loadedGi.causticsPhotonMapFile();
    gi.dynamicPhotonMapFile = loadedGi.dynamicPhotonMapFile();
    gi.fgUseLegacy = loadedGi.fgUseLegacy();
    out.AOSettings.aoFile = loaded.AOSettings.aoFile();
    out.FrameSettings.renderThreads = loaded.FrameSettings.renderThreads();
    out.RenderSettings.bias = loaded.RenderSettings.bias();
    errno = 0;
    if (writeSettings(file, out)) return kStatusSuccess;
    const int code = errno;
    message(kMsgError, 6, "Unable to write the configuration %s: %s", file.c_str(),
            code != 0 ? std::strerror(code) : "the XML writer failed");
    return kStatusFailure;
}

float previewGamma(const OutputCorrectionBase &correction) {
    switch (correction.colorCorrection.value()) {
        case int32_t(ColorCorrection::None):
            return 1.0f;
        case int32_t(ColorCorrection::Gamma):
            return correction.gamma();
        case int32_t(ColorCorrection::SRGB):
            return 2.2f;
        default:
            message(kMsgWarning, 6, "Unsupported enum when setting gamma for gl observer");
            return 1.0f;
    }
}

}  // namespace ox
