#pragma once

#include <atomic>
#include <cstdint>
#include <mutex>

#include "core/render_io.h"

namespace ox {

/// The console progress object: progress marks as progress messages, abort and release flags.
class RioImpl final : public RenderIOInterface {
public:
    /// The default reporting step: one line per tenth.
    static constexpr float kDefaultStep = 0.1f;
    /// The finest step accepted; finer steps are raised to it (at most 1000 lines per phase).
    static constexpr float kMinStep = 0.001f;

    /// A progress object printing one line per step (a step outside [kMinStep, 1], or NaN,
    /// falls back to the nearest accepted value, NaN to kDefaultStep).
    explicit RioImpl(float step = kDefaultStep);

    bool isAborted() const override;
    bool isReleased() override;
    void setProgressTitle(const std::string &title) override;
    void beginCommand() override;
    void endCommand() override;
    void finish() override;
    void setProgress(float fraction) override;
    void abort() override;
    void release() override;
    void clearRelease() override;
    void refreshDisplay() override;

    /// The reporting step in use.
    float step() const { return step_; }
    /// The last mark reported in the current phase (0 to 1 + step / 2).
    float lastProgress();

private:
    std::atomic<bool> aborted_{false};
    bool released_ = false;
    // Marks are counted, not summed, so that the tenth mark reads exactly 100.0.
    int64_t marks_ = 0;
    float step_;
    std::mutex mutex_;
};

}  // namespace ox
