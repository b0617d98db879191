#include "app/run.h"

#include <signal.h>
#include <sys/resource.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <exception>
#include <new>

#include "app/exit_status.h"
#include "config/settings_frame.h"
#include "core/benchmark.h"
#include "core/message.h"
#include "core/render_io_console.h"
#include "core/run_statistics.h"
#include "platform/file_system.h"
#include "platform/system.h"
#include "render/image_writer.h"

namespace ox {
namespace {

constexpr int kRevision = 179347;
constexpr int64_t kMaxRenderThreads = 1024;
constexpr int kCrashSignals[] = {SIGSEGV, SIGBUS, SIGFPE, SIGILL, SIGABRT, SIGSYS, SIGTRAP};

extern "C" void silentCrash(int) { _exit(139); }

/// A GI mode reads a stored map or cache when it is mode 2 or 3.
bool readsStored(int32_t mode) { return mode == 2 || mode == 3; }

bool usesIntegrator(const InputCheckSettings &s, int32_t integrator) {
    return s.enableGI && (s.primaryIntegrator == integrator || s.secondaryIntegrator == integrator);
}

int32_t writeFile(RunSettingsInterface &settings, bool schema) {
    const char *file = schema ? "config.xsd" : "config.xml";
    message(kMsgProgress, 6,
            schema ? "Writing a default xml schema file (config.xsd)"
                   : "Writing a default xml file (config.xml)");
    FileSystemUtilities::setLastError(0);
    const bool ok = schema ? settings.writeSchema(file) : settings.writeDefault(file);
    if (!ok) {
        const int code = FileSystemUtilities::lastError();
        message(kMsgError, 6, "Unable to write %s: %s", file,
                code != 0 ? std::strerror(code) : "unknown error");
        return statusFromPlatformError(code);
    }
    message(kMsgProgress, 6, "Done!");
    return kStatusSuccess;
}

int32_t runDriver(const RunEnvironment &env, int32_t action, RunContext &context) {
    RunDriverInterface *driver = env.drivers.find(action);
    if (!driver) {
        message(kMsgError, 6, "The %s is not available: this build has no driver for it.",
                describeRunAction(action, context.options).c_str());
        return kStatusUnsupported;
    }
    return driver->run(action, context);
}

int32_t run(const std::vector<std::string> &args, const RunEnvironment &env) {
    // Denormal numbers would slow shading by orders of magnitude; flushed for the whole run
    // (worker threads set it themselves).
    setFlushDenormalsToZero();
    // The banner first, so that every log starts by naming the build that wrote it.
    message(kMsgInfo, 6, "Zarnex Vorn (Rev: %d)", kRevision);
    // The main thread's benchmark timers must exist before anything is timed.
    BenchmarkRegistry::instance().attachThread();
    CommandLineOptions options;
    if (!parseCommandLine(args, env.loadInputList, options)) {
        message(kMsgError, 6, "%s", kUsageText);
        return kStatusSyntaxError;
    }
    // Crash handling and priority come from the command line and hold for the whole run.
    installCrashHandler(options.crashSilently);
    if (options.priority != kCommandPriorityNone) setProcessPriority(options.priority - 1);
    const std::string outputDirectory =
        options.outputDirectory.empty() ? std::string("./") : options.outputDirectory;
    // Messages need filters before the configuration is read; the debug file waits until the
    // output tree exists.
    std::unique_ptr<RunSettingsInterface> settings =
        env.makeSettings ? env.makeSettings() : std::make_unique<DefaultRunSettings>();
    OutputVerbosityFlags flags = settings->outputVerbosity();
    flags.debugFile = false;
    applyOutputVerbosity(flags, outputDirectory);

    const int processors = env.processorCount ? env.processorCount() : processorCount();
    RioImpl progress(RioImpl::kDefaultStep);
    RunStatistics statistics("Vorn");
    const std::string baseName = options.outputFile.empty() ? "result" : options.outputFile;
    std::unique_ptr<PreviewObserverInterface> preview;
    auto context = [&](int32_t format, int64_t threads) {
        return RunContext{options,  *settings, progress, statistics, outputDirectory,
                          baseName, format,    threads,  &preview};
    };

    // Writing defaults and merging files must work without (or despite) a configuration.
    switch (options.action) {
        case kActionWriteConfig:
            return writeFile(*settings, false);
        case kActionWriteSchema:
            return writeFile(*settings, true);
        case kActionPointCloudMerge:
        case kActionPointCloudMergeB:
        case kActionBoundaryMerge: {
            RunContext c = context(resolveFileFormat(options.fileFormat, settings->imageFormat()),
                                   settings->renderThreads());
            return runDriver(env, options.action, c);
        }
        default:
            break;
    }
    if (!options.configFiles.empty() && !settings->load(options.configFiles.front())) {
        message(kMsgError, 6, "Unable to load settings from file %s",
                options.configFiles.front().c_str());
        return kStatusConfigLoad;
    }
    // Splitting a configuration reads it but creates no output tree.
    if (options.action == kActionSplitConfig) {
        RunContext c = context(resolveFileFormat(options.fileFormat, settings->imageFormat()),
                               settings->renderThreads());
        return runDriver(env, options.action, c);
    }
    // From here on the configuration's own filters apply.
    flags = settings->outputVerbosity();
    const bool wantDebugFile = flags.debugFile;
    flags.debugFile = false;
    applyOutputVerbosity(flags, outputDirectory);
    // The debug file lives inside the output tree, so the tree comes first.
    if (const int32_t status = prepareOutputTree(outputDirectory, *settings); status != 0)
        return status;
    if (wantDebugFile) {
        flags.debugFile = true;
        applyOutputVerbosity(flags, outputDirectory);
    }
    const int32_t action = resolveAction(options.action, *settings);
    if (action == kActionNone) {
        message(kMsgError, 6, "The renderType %d names no kind of run.", settings->renderType());
        return kStatusUnsupported;
    }
    const int64_t threads = resolveRenderThreads(options.renderThreads, *settings, processors);
    // Image files are compressed on as many threads as the run renders with.
    setImageWriterThreads(int32_t(std::min<int64_t>(threads, 64)));
    // Inputs are checked before any work starts, so a bad run fails fast.
    if (const int32_t status = checkInputs(action, *settings); status != 0) return status;
    const int32_t format = resolveFileFormat(options.fileFormat, settings->imageFormat());
    int32_t status = kStatusUnsupported;
    switch (action) {
        case kActionRender:
        case kActionTextureBake:
        case kActionSurfaceTransfer:
        case kActionVertexBake:
        case kActionVertexTransfer:
        case kActionPathTracerMerge:
        case kActionPointCloudBake:
        case kActionRegionMerge:
        case kActionUvPack:
        case kActionImageMerge: {
            RunContext c = context(format, threads);
            status = runDriver(env, action, c);
            break;
        }
        default:
            message(kMsgError, 6, "The %s cannot run on a scene.",
                    describeRunAction(action, options).c_str());
            break;
    }
    // Statistics and timings are reported whatever the outcome, for diagnosis.
    statistics.print();
    BenchmarkRegistry::instance().report();
    // After a successful run wait until the preview is closed (-q has aborted the progress
    // object already, which closes it).
    if (preview) {
        if (status == kStatusSuccess) preview->waitUntilClosed(progress);
        preview.reset();
    }
    return status;
}

}  // namespace

void installCrashHandler(bool crashSilently) {
    struct sigaction action {};
    sigemptyset(&action.sa_mask);
    if (crashSilently) {
        action.sa_handler = silentCrash;
        // No core dump and no report: the process just ends.
        struct rlimit none {
            0, 0
        };
        setrlimit(RLIMIT_CORE, &none);
    } else {
        action.sa_handler = SIG_DFL;
    }
    for (int sig : kCrashSignals) sigaction(sig, &action, nullptr);
}

int32_t resolveAction(int32_t action, RunSettingsInterface &settings) {
    // Actions and render types name the same kinds of run, in this pairing.
    static const struct {
        int32_t action;
        RenderType type;
    } kPairs[] = {{kActionRender, RenderType::Render},
                  {kActionTextureBake, RenderType::TextureBake},
                  {kActionVertexBake, RenderType::VertexBake},
                  {kActionSurfaceTransfer, RenderType::SurfaceTransfer},
                  {kActionVertexTransfer, RenderType::VertexTransfer},
                  {kActionPointCloudBake, RenderType::PointCloudBake}};
    if (action == kActionNone) {
        for (const auto &pair : kPairs)
            if (settings.renderType() == int32_t(pair.type)) action = pair.action;
    } else {
        for (const auto &pair : kPairs)
            if (action == pair.action) settings.setRenderType(int32_t(pair.type));
    }
    if (action == kActionVertexBake || action == kActionVertexTransfer ||
        action == kActionPointCloudBake)
        settings.setFgUseLegacy(true);
    return action;
}

int64_t resolveRenderThreads(int64_t commandLineThreads, RunSettingsInterface &settings,
                             int processors) {
    auto clamped = [](int64_t count) {
        const int64_t c = std::clamp<int64_t>(count, 1, kMaxRenderThreads);
        if (c != count)
            message(kMsgWarning, 6, "The render thread count %lld is outside 1 to %lld, using %lld",
                    static_cast<long long>(count), static_cast<long long>(kMaxRenderThreads),
                    static_cast<long long>(c));
        return c;
    };
    int64_t threads;
    if (commandLineThreads == -1 && settings.autoThreads()) {
        const int64_t detected = std::max(processors, 1);
        threads =
            std::clamp<int64_t>(detected - settings.autoThreadsSubtract(), 1, kMaxRenderThreads);
        message(kMsgInfo, 6, "Detected %lld cores, using %lld cores",
                static_cast<long long>(detected), static_cast<long long>(threads));
    } else if (commandLineThreads == -1) {
        threads = clamped(settings.renderThreads());
    } else {
        threads = clamped(commandLineThreads);
    }
    settings.setRenderThreads(threads);
    return threads;
}

int32_t resolveFileFormat(int32_t fileFormat, int32_t imageFormat) {
    if (fileFormat != kFormatNone) return fileFormat;
    switch (ImageFormatType(imageFormat)) {
        case ImageFormatType::TGA:
            return kFormatTga;
        case ImageFormatType::EXRMultiLayer:
            return kFormatExrMultiLayer;
        default:
            return kFormatExr;
    }
}

int32_t prepareOutputTree(const std::string &outputDirectory, RunSettingsInterface &settings) {
    static const char *const kSubdirectories[] = {
        "", "GI", "GI/fgMaps", "GI/ptMaps", "GI/photonMaps", "GI/occMaps"};
    for (const char *sub : kSubdirectories) {
        const std::string dir = outputDirectory + sub;
        if (!FileSystemUtilities::createDirectories(dir)) {
            const int code = FileSystemUtilities::lastError();
            message(kMsgError, 6, "Unable to create the output directory %s: %s", dir.c_str(),
                    std::strerror(code));
            return statusFromPlatformError(code);
        }
    }
    static const struct {
        CacheFile file;
        const char *subdirectory;
    } kCaches[] = {{CacheFile::kFinalGather, "GI/fgMaps/"},
                   {CacheFile::kPathTracer, "GI/ptMaps/"},
                   {CacheFile::kGlobalPhotonMap, "GI/photonMaps/"},
                   {CacheFile::kCausticsPhotonMap, "GI/photonMaps/"},
                   {CacheFile::kDynamicPhotonMap, "GI/photonMaps/"},
                   {CacheFile::kOcclusionMap, "GI/occMaps/"}};
    for (const auto &cache : kCaches) {
        const std::string name = settings.cacheFile(cache.file);
        if (!name.empty())
            settings.setCacheFile(cache.file, outputDirectory + cache.subdirectory + name);
    }
    return kStatusSuccess;
}

int32_t checkInputs(int32_t action, const RunSettingsInterface &settings) {
    const InputCheckSettings s = settings.inputCheckSettings();
    if (s.vertexBakeLightPasses > 0 && action == kActionVertexBake) {
        message(kMsgError, 6,
                "Light passes are not supported together with vertex bakes. Use vertex transfer "
                "instead!");
        return kStatusUnsupported;
    }
    auto checkSize = [](const std::optional<TargetSize> &target, const char *kind) {
        if (!target || (target->width != 0 && target->height != 0)) return true;
        message(kMsgError, 6, "%s '%s' with invalid dimension %lldx%lld.\n", kind,
                target->name.c_str(), static_cast<long long>(target->width),
                static_cast<long long>(target->height));
        return false;
    };
    if (settings.renderType() == int32_t(RenderType::TextureBake) &&
        !checkSize(s.firstTextureBakeTarget, "BakeTextureTarget"))
        return kStatusZeroDimension;
    if (settings.renderType() == int32_t(RenderType::SurfaceTransfer) &&
        !checkSize(s.firstSurfaceTransferTarget, "SurfaceTransferTexture"))
        return kStatusZeroDimension;

    const bool fg =
        usesIntegrator(s, kIntegratorFinalGather) && readsStored(s.finalGatherCacheMode);
    const std::string fgFile = settings.cacheFile(CacheFile::kFinalGather);
    const struct {
        bool check;
        std::string path;
        const char *description;
    } files[] = {
        {s.imageBasedEnvironment && !s.environmentImageFile.empty(), s.environmentImageFile,
         "ibl environment file"},
        {readsStored(s.causticsPhotonMapMode), settings.cacheFile(CacheFile::kCausticsPhotonMap),
         "caustics photon map file"},
        {usesIntegrator(s, kIntegratorDynamicPhotonMap) && readsStored(s.dynamicPhotonMapMode),
         settings.cacheFile(CacheFile::kDynamicPhotonMap), "dynamic photon map file"},
        {usesIntegrator(s, kIntegratorGlobalPhotonMap) && readsStored(s.globalPhotonMapMode),
         settings.cacheFile(CacheFile::kGlobalPhotonMap), "global photon map file"},
        {fg && s.finalGatherCacheKind == 1, fgFile + ".irradiance", "fg irradiance file"},
        {fg && s.finalGatherCacheKind == 2, fgFile, "fg radiance file"},
        {usesIntegrator(s, kIntegratorPathTracer) && readsStored(s.pathTracerCacheMode),
         settings.cacheFile(CacheFile::kPathTracer), "pt file"},
        {action == kActionPointCloudBake && s.pointCloudBakeUsesLua, s.pointCloudBakeLuaFile,
         "point cloud bake lua file"},
        {(action == kActionTextureBake || action == kActionSurfaceTransfer) && s.textureBakeUsesLua,
         s.textureBakeLuaFile, "texture bake lua settings"},
        {(action == kActionVertexBake || action == kActionVertexTransfer) && s.vertexBakeUsesLua,
         s.vertexBakeLuaFile, "vertex bake lua settings"},
    };
    for (const auto &f : files) {
        if (!f.check || FileSystemUtilities::canRead(f.path)) continue;
        const int code = FileSystemUtilities::lastError();
        message(kMsgError, 6, "Unable to read %s '%s'.", f.description, f.path.c_str());
        return statusFromPlatformError(code);
    }
    return kStatusSuccess;
}

int32_t runThevorn(const std::vector<std::string> &args, const RunEnvironment &environment) {
    // No exception leaves the run: whatever escapes a subsystem ends it as a general failure.
    try {
        return run(args, environment);
    } catch (const std::bad_alloc &) {
        message(kMsgError, 6, "Out of memory.");
    } catch (const std::exception &e) {
        message(kMsgError, 6, "Unexpected failure: %s", e.what());
    } catch (...) {
        message(kMsgError, 6, "Unexpected failure.");
    }
    return kStatusFailure;
}

}  // namespace ox
