#pragma once

#include <string>
#include <vector>

#include "app/config_run_settings.h"
#include "app/run.h"
#include "tests/support/test_support.h"

/// What the run tests share: a driver that remembers what it was handed, and whole files.
namespace apptest {

using oxtest::readFile;

/// A driver that remembers the action, the context and the settings behind them; it looks at the
/// settings while it runs, since they live only as long as the run.
struct RecordingDriver : ox::RunDriverInterface {
    int32_t run(int32_t action, ox::RunContext &c) override {
        actions.push_back(action);
        baseName = c.outputBaseName;
        directory = c.outputDirectory;
        format = c.format;
        threads = c.renderThreads;
        renderType = c.settings.renderType();
        renderThreads = c.settings.renderThreads();
        fgFile = c.settings.cacheFile(ox::CacheFile::kFinalGather);
        if (auto *d = dynamic_cast<ox::DefaultRunSettings *>(&c.settings))
            fgUseLegacy = d->fgUseLegacy;
        const ox::OXConfig *config = ox::configurationOf(c.settings);
        configured = config != nullptr;
        if (config) {
            fgUseLegacy = config->GISettings.fgUseLegacy();
            tileSize = config->FrameSettings.tileSize();
        }
        c.statistics.beginPass("beauty");
        c.progress.setProgress(1.0f);
        c.progress.finish();
        return result;
    }
    std::vector<int32_t> actions;
    std::string baseName, directory, fgFile;
    int32_t format = -1, renderType = -1, result = 0;
    int64_t threads = -1, renderThreads = -1;
    bool fgUseLegacy = false, configured = false;
    ox::Vec2i tileSize;
};

}  // namespace apptest
