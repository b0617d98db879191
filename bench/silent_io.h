#pragma once

#include <benchmark/benchmark.h>

#include <string>

#include "core/render_io.h"

namespace oxbench {

/// Progress goes nowhere (kept from being optimised away); nothing aborts.
class SilentIO final : public ox::RenderIOInterface {
public:
    bool isAborted() const override { return false; }
    bool isReleased() override { return false; }
    void setProgressTitle(const std::string &) override {}
    void beginCommand() override {}
    void endCommand() override {}
    void finish() override {}
    void setProgress(float fraction) override { benchmark::DoNotOptimize(fraction); }
    void abort() override {}
    void release() override {}
    void clearRelease() override {}
    void refreshDisplay() override {}
};

}  // namespace oxbench
