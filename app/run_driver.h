#pragma once

#include <array>
#include <cstdint>
#include <memory>
#include <string>

#include "app/command_line.h"
#include "app/preview.h"
#include "app/run_settings.h"
#include "core/render_io.h"
#include "core/run_statistics.h"

namespace ox {

/// Everything a driver gets from the run.
struct RunContext {
    const CommandLineOptions &options;  ///< the parsed command line
    RunSettingsInterface &settings;     ///< the loaded configuration
    RenderIOInterface &progress;        ///< the run's progress object (step 0.1)
    RunStatistics &statistics;          ///< the run's statistics tree "Vorn"
    std::string outputDirectory;        ///< ends in "/" ("./" by default)
    std::string outputBaseName;         ///< outputFile, or "result"
    int32_t format;                     ///< resolved FileFormat (never kFormatNone)
    int64_t renderThreads;              ///< resolved thread count
    /// The run's preview slot: a driver that shows the frame puts its observer here; the run
    /// waits for it after a successful run and destroys it (null: no slot).
    std::unique_ptr<PreviewObserverInterface> *preview = nullptr;
};

/// One kind of run (camera/bake, vertex bake, merges, split, UV packing...). Returns the run
/// status of the exit status table, having reported its own failure as one error message.
class RunDriverInterface {
public:
    virtual ~RunDriverInterface() = default;
    /// Runs action with the run's context.
    virtual int32_t run(int32_t action, RunContext &context) = 0;
    /// False when this build can register the driver for action but not yet run it.
    virtual bool supports(int32_t action) const {
        (void)action;
        return true;
    }
};

/// The drivers known to this build, by action code.
class DriverTable {
public:
    /// Largest action code plus one.
    static constexpr int kActionSlots = 21;

    /// Makes driver run action (replacing any earlier one).
    void set(int32_t action, std::shared_ptr<RunDriverInterface> driver) {
        if (action >= 0 && action < kActionSlots) drivers_[action] = std::move(driver);
    }
    /// The driver of action, or null.
    RunDriverInterface *find(int32_t action) const {
        return action >= 0 && action < kActionSlots ? drivers_[action].get() : nullptr;
    }

private:
    std::array<std::shared_ptr<RunDriverInterface>, kActionSlots> drivers_;
};

}  // namespace ox
