#include "app/config_run_settings.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <limits>

#include "config/settings_checks.h"
#include "config/xml.h"
#include "platform/file_system.h"

namespace ox {
namespace {

/// The size of a bake target: its own size scaled by the texel scale, or the frame resolution.
TargetSize targetSize(const std::string &name, bool hasOwnSize, Vec2i ownSize, float scale,
                      Vec2i resolution) {
    TargetSize size;
    size.name = name;
    if (hasOwnSize) {
        // Truncation towards zero, computed in double so that huge scales cannot overflow.
        const double w = double(ownSize.x) * double(scale);
        const double h = double(ownSize.y) * double(scale);
        const double limit = double(std::numeric_limits<int32_t>::max());
        size.width = w > 0.0 ? int64_t(std::min(w, limit)) : 0;
        size.height = h > 0.0 ? int64_t(std::min(h, limit)) : 0;
    } else {
        size.width = resolution.x;
        size.height = resolution.y;
    }
    return size;
}

/// The key holding a GI cache file name (Config is OXConfigBase, const or not).
template <typename Config>
auto &cacheKey(Config &config, CacheFile which) {
    auto &gi = config.GISettings;
    switch (which) {
        case CacheFile::kFinalGather:
            return gi.fgFile;
        case CacheFile::kPathTracer:
            return gi.ptFile;
        case CacheFile::kGlobalPhotonMap:
            return gi.globalPhotonMapFile;
        case CacheFile::kCausticsPhotonMap:
            return gi.causticsPhotonMapFile;
        case CacheFile::kDynamicPhotonMap:
            return gi.dynamicPhotonMapFile;
        case CacheFile::kOcclusionMap:
            break;
    }
    return config.AOSettings.aoFile;
}

/// Ends a failed write with the platform code for the run's exit status.
bool writeResult(bool ok) {
    if (!ok) FileSystemUtilities::setLastError(errno);
    return ok;
}

}  // namespace

bool ConfigRunSettings::load(const std::string &file) {
    if (!loadSettings(file, config_)) return false;
    checkLoadedSettings(config_);
    copyInto(loaded_, config_);
    return true;
}

bool ConfigRunSettings::writeDefault(const std::string &file) {
    errno = 0;
    const OXConfig defaults;
    return writeResult(writeSettings(file, defaults));
}

bool ConfigRunSettings::writeSchema(const std::string &file) {
    errno = 0;
    return writeResult(ox::writeSchema(file, config_));
}

OutputVerbosityFlags ConfigRunSettings::outputVerbosity() const {
    return verbosityFlags(config_.FrameSettings.outputVerbosity);
}

int32_t ConfigRunSettings::renderType() const { return config_.FrameSettings.renderType.value(); }

void ConfigRunSettings::setRenderType(int32_t value) {
    config_.FrameSettings.renderType.setValue(value);
}

int32_t ConfigRunSettings::imageFormat() const { return config_.FrameSettings.imageFormat.value(); }

bool ConfigRunSettings::autoThreads() const { return config_.FrameSettings.autoThreads(); }

int64_t ConfigRunSettings::autoThreadsSubtract() const {
    return config_.FrameSettings.autoThreadsSubtract();
}

int64_t ConfigRunSettings::renderThreads() const { return config_.FrameSettings.renderThreads(); }

void ConfigRunSettings::setRenderThreads(int64_t value) {
    config_.FrameSettings.renderThreads =
        uint32_t(std::clamp<int64_t>(value, 0, std::numeric_limits<uint32_t>::max()));
}

std::string ConfigRunSettings::cacheFile(CacheFile which) const {
    return cacheKey(config_, which).get();
}

void ConfigRunSettings::setCacheFile(CacheFile which, const std::string &name) {
    cacheKey(config_, which) = name;
}

void ConfigRunSettings::setFgUseLegacy(bool value) { config_.GISettings.fgUseLegacy = value; }

InputCheckSettings ConfigRunSettings::inputCheckSettings() const {
    const FrameSettingsBase &frame = config_.FrameSettings;
    const GISettingsBase &gi = config_.GISettings;
    const EnvironmentSettingsBase &env = config_.EnvironmentSettings;
    const TextureBakeSettingsBase &bake = config_.TextureBakeSettings;
    const SurfaceTransferSettingsBase &transfer = config_.SurfaceTransferSettings;
    const VertexBakeSettingsBase &vertex = config_.VertexBakeSettings;
    const PointCloudBakeComponentsBase &points =
        config_.PointCloudBakeSettings.PointCloudBakeComponents;

    InputCheckSettings s;
    s.vertexBakeLightPasses = int32_t(vertex.VertexBakeComponents.lightPass.size());
    if (bake.targets.size() > 0) {
        const BakeTextureTargetBase &t = bake.targets[0];
        s.firstTextureBakeTarget =
            targetSize(t.textureName(), t.hasResolutionOverride(), t.resolutionOverride(),
                       bake.resolutionScale(), frame.resolution());
    }
    if (transfer.targets.size() > 0) {
        const SurfaceTransferTextureBase &t = transfer.targets[0];
        s.firstSurfaceTransferTarget =
            targetSize(t.textureName(), t.hasResolutionOverride(), t.resolutionOverride(),
                       bake.resolutionScale(), frame.resolution());
    }
    s.imageBasedEnvironment =
        env.rtEnvironment() == EnvironmentType::IBL || env.giEnvironment() == EnvironmentType::IBL;
    s.environmentImageFile = env.iblImageFile();
    s.enableGI = gi.enableGI();
    s.primaryIntegrator = gi.primaryIntegrator.value();
    s.secondaryIntegrator = gi.secondaryIntegrator.value();
    s.causticsPhotonMapMode = gi.causticsPhotonMapUseFile.value();
    s.dynamicPhotonMapMode = gi.dynamicPhotonMapUseFile.value();
    s.globalPhotonMapMode = gi.globalPhotonMapUseFile.value();
    s.finalGatherCacheKind = gi.fgUseCache.value();
    s.finalGatherCacheMode = gi.fgUseFile.value();
    s.pathTracerCacheMode = gi.ptUseFile.value();
    s.pointCloudBakeUsesLua = points.lua();
    s.pointCloudBakeLuaFile = points.LUASettings.scriptFile();
    s.textureBakeUsesLua = bake.RenderComponents.lua();
    s.textureBakeLuaFile = bake.RenderComponents.LUASettings.scriptFile();
    s.vertexBakeUsesLua = vertex.VertexBakeComponents.lua();
    s.vertexBakeLuaFile = vertex.VertexBakeComponents.LUASettings.scriptFile();
    return s;
}

OXConfig *configurationOf(RunSettingsInterface &settings) {
    auto *real = dynamic_cast<ConfigRunSettings *>(&settings);
    return real ? &real->config() : nullptr;
}

const OXConfig *configurationOf(const RunSettingsInterface &settings) {
    const auto *real = dynamic_cast<const ConfigRunSettings *>(&settings);
    return real ? &real->config() : nullptr;
}

}  // namespace ox
