#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "core/message.h"

namespace ox {

/// The GI cache files whose names the run prefixes with the output tree.
enum class CacheFile {
    kFinalGather,        ///< final-gather cache, "GI/fgMaps/"
    kPathTracer,         ///< path-tracer cache, "GI/ptMaps/"
    kGlobalPhotonMap,    ///< global photon map, "GI/photonMaps/"
    kCausticsPhotonMap,  ///< caustics photon map, "GI/photonMaps/"
    kDynamicPhotonMap,   ///< dynamic photon map, "GI/photonMaps/"
    kOcclusionMap,       ///< adaptive occlusion cache, "GI/occMaps/"
};

/// Name and size (already resolved: resolution, or own size times texel scale) of a target.
struct TargetSize {
    std::string name;    ///< the target's name
    int64_t width = 0;   ///< pixels
    int64_t height = 0;  ///< pixels
};

/// GI integrator numbers as the configuration stores them.
enum GiIntegrator : int32_t {
    kIntegratorGlobalPhotonMap = 1,
    kIntegratorDynamicPhotonMap = 2,
    kIntegratorPathTracer = 3,
    kIntegratorFinalGather = 4,
};

/// What the input check reads of the configuration. Cache file names come from cacheFile().
struct InputCheckSettings {
    int32_t vertexBakeLightPasses = 0;                 ///< light-pass entries of the vertex bake
    std::optional<TargetSize> firstTextureBakeTarget;  ///< none when the list is empty
    std::optional<TargetSize> firstSurfaceTransferTarget;  ///< none when the list is empty
    bool imageBasedEnvironment = false;                    ///< an image-based environment is in use
    std::string environmentImageFile;                      ///< its image file
    bool enableGI = false;                                 ///< GISettings enableGI
    int32_t primaryIntegrator = 0;                         ///< GiIntegrator or 0
    int32_t secondaryIntegrator = 0;                       ///< GiIntegrator or 0
    int32_t causticsPhotonMapMode = 0;                     ///< modes 2 and 3 read a stored map
    int32_t dynamicPhotonMapMode = 0;                      ///< modes 2 and 3 read a stored map
    int32_t globalPhotonMapMode = 0;                       ///< modes 2 and 3 read a stored map
    int32_t finalGatherCacheKind = 0;                      ///< 1 irradiance, 2 radiance
    int32_t finalGatherCacheMode = 0;                      ///< modes 2 and 3 read a stored cache
    int32_t pathTracerCacheMode = 0;                       ///< modes 2 and 3 read a stored cache
    bool pointCloudBakeUsesLua = false;  ///< the point-cloud bake runs a Lua script
    std::string pointCloudBakeLuaFile;   ///< that script
    bool textureBakeUsesLua = false;     ///< the texture bake uses Lua settings
    std::string textureBakeLuaFile;      ///< that file
    bool vertexBakeUsesLua = false;      ///< the vertex bake uses Lua settings
    std::string vertexBakeLuaFile;       ///< that file
};

/// What the run reads and writes of the configuration. The configuration subsystem implements
/// it over the real settings tree; DefaultRunSettings holds the defaults only.
class RunSettingsInterface {
public:
    virtual ~RunSettingsInterface() = default;

    /// Reads a configuration file over the current values (defaults stay where it is silent).
    /// False when it cannot be loaded; the run then reports the failure.
    virtual bool load(const std::string &file) = 0;
    /// Writes the default configuration (atomically); on failure false with the platform code
    /// in FileSystemUtilities::lastError() (0 when there is none).
    virtual bool writeDefault(const std::string &file) = 0;
    /// Writes the configuration schema, like writeDefault.
    virtual bool writeSchema(const std::string &file) = 0;

    /// The OutputVerbosity switches.
    virtual OutputVerbosityFlags outputVerbosity() const = 0;
    /// FrameSettings renderType (0 Render ... 5 PointCloudBake).
    virtual int32_t renderType() const = 0;
    /// Writes FrameSettings renderType.
    virtual void setRenderType(int32_t value) = 0;
    /// FrameSettings imageFormat (ImageFormatType value).
    virtual int32_t imageFormat() const = 0;
    /// FrameSettings autoThreads.
    virtual bool autoThreads() const = 0;
    /// FrameSettings autoThreadsSubtract.
    virtual int64_t autoThreadsSubtract() const = 0;
    /// FrameSettings renderThreads.
    virtual int64_t renderThreads() const = 0;
    /// Writes FrameSettings renderThreads.
    virtual void setRenderThreads(int64_t value) = 0;
    /// The file name of a GI cache (empty = none).
    virtual std::string cacheFile(CacheFile which) const = 0;
    /// Writes the file name of a GI cache.
    virtual void setCacheFile(CacheFile which, const std::string &name) = 0;
    /// Writes GISettings fgUseLegacy.
    virtual void setFgUseLegacy(bool value) = 0;
    /// What the input check needs.
    virtual InputCheckSettings inputCheckSettings() const = 0;
};

/// The configuration defaults, for builds without the configuration reader: load fails, the
/// writers write the frame settings the run knows.
class DefaultRunSettings : public RunSettingsInterface {
public:
    bool load(const std::string &file) override;
    bool writeDefault(const std::string &file) override;
    bool writeSchema(const std::string &file) override;
    OutputVerbosityFlags outputVerbosity() const override { return verbosity; }
    int32_t renderType() const override { return renderTypeValue; }
    void setRenderType(int32_t value) override { renderTypeValue = value; }
    int32_t imageFormat() const override { return imageFormatValue; }
    bool autoThreads() const override { return autoThreadsValue; }
    int64_t autoThreadsSubtract() const override { return autoThreadsSubtractValue; }
    int64_t renderThreads() const override { return renderThreadsValue; }
    void setRenderThreads(int64_t value) override { renderThreadsValue = value; }
    std::string cacheFile(CacheFile which) const override;
    void setCacheFile(CacheFile which, const std::string &name) override;
    void setFgUseLegacy(bool value) override { fgUseLegacy = value; }
    InputCheckSettings inputCheckSettings() const override { return inputCheck; }

    OutputVerbosityFlags verbosity;        ///< outputVerbosity
    int32_t renderTypeValue = 0;           ///< Render
    int32_t imageFormatValue = 0;          ///< TGA
    bool autoThreadsValue = true;          ///< autoThreads
    int64_t autoThreadsSubtractValue = 0;  ///< autoThreadsSubtract
    int64_t renderThreadsValue = 2;        ///< renderThreads
    bool fgUseLegacy = false;              ///< GISettings fgUseLegacy
    std::string cacheFiles[6];             ///< by CacheFile
    InputCheckSettings inputCheck;         ///< nothing to check
};

}  // namespace ox
