#pragma once

#include <atomic>
#include <mutex>
#include <string>
#include <vector>

#include "core/render_io.h"

namespace oxtest {

/// Records what a run reports; can abort itself after a number of progress reports or, whatever
/// the threads' timing, at a given abort check.
class FakeIO : public ox::RenderIOInterface {
public:
    bool isAborted() const override {
        if (abortAtCheck > 0 && checks.fetch_add(1) + 1 >= abortAtCheck) aborted = true;
        return aborted.load();
    }
    bool isReleased() override { return false; }
    void setProgressTitle(const std::string &title) override { record("title " + title); }
    void beginCommand() override { record("begin"); }
    void endCommand() override { record("end"); }
    void finish() override { record("finish"); }
    void setProgress(float fraction) override {
        std::lock_guard<std::mutex> lock(mutex);
        progress.push_back(fraction);
        if (abortAfter > 0 && int(progress.size()) >= abortAfter) aborted = true;
    }
    void abort() override { aborted = true; }
    void release() override {}
    void clearRelease() override {}
    void refreshDisplay() override {}

    void record(const std::string &e) {
        std::lock_guard<std::mutex> lock(mutex);
        events.push_back(e);
    }

    std::mutex mutex;
    std::vector<std::string> events;
    std::vector<float> progress;
    mutable std::atomic<bool> aborted{false};
    mutable std::atomic<int> checks{0};
    int abortAfter = 0;
    int abortAtCheck = 0;
};

}  // namespace oxtest
