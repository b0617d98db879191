#pragma once

#include <string>

#include "app/run_settings.h"
#include "config/ox_config.h"

/// The run's view of the real configuration tree.
namespace ox {

/// RunSettingsInterface over an OXConfig: loading (with the checks of settings_checks.h),
/// writing the default configuration and the schema, and the keys the run reads and writes.
class ConfigRunSettings final : public RunSettingsInterface {
public:
    /// The whole configuration tree, for the drivers.
    OXConfig &config() { return config_; }
    /// The whole configuration tree, for the drivers.
    const OXConfig &config() const { return config_; }
    /// The configuration as loaded (defaults without a file), before the run changed anything:
    /// configurations the run writes take the keys the run changes from here.
    const OXConfig &loaded() const { return loaded_; }

    bool load(const std::string &file) override;
    bool writeDefault(const std::string &file) override;
    bool writeSchema(const std::string &file) override;
    OutputVerbosityFlags outputVerbosity() const override;
    int32_t renderType() const override;
    void setRenderType(int32_t value) override;
    int32_t imageFormat() const override;
    bool autoThreads() const override;
    int64_t autoThreadsSubtract() const override;
    int64_t renderThreads() const override;
    void setRenderThreads(int64_t value) override;
    std::string cacheFile(CacheFile which) const override;
    void setCacheFile(CacheFile which, const std::string &name) override;
    void setFgUseLegacy(bool value) override;
    InputCheckSettings inputCheckSettings() const override;

private:
    OXConfig config_;
    OXConfig loaded_;
};

/// The configuration tree behind the run's settings, or nullptr when the run has none.
OXConfig *configurationOf(RunSettingsInterface &settings);
/// The configuration tree behind the run's settings, or nullptr when the run has none.
const OXConfig *configurationOf(const RunSettingsInterface &settings);

}  // namespace ox
