#include "core/timer.h"

#include <atomic>
#include <chrono>
#include <cinttypes>
#include <cmath>
#include <cstdio>

#include "core/message.h"

namespace ox {
namespace {

using Clock = std::chrono::steady_clock;
constexpr int64_t kFrequency = Clock::period::den / Clock::period::num;
static_assert(Clock::period::num == 1, "the counter must tick at a whole frequency");

std::atomic<int64_t> gOverhead{0};

}  // namespace

struct TimerCalibration {
    TimerCalibration() {
        message(kMsgVerbose, 6, "Calibrated Timer Frequency: %dMHz",
                static_cast<int>(kFrequency / 1000000));
        Timer t{Timer::NoCalibration{}};
        for (int i = 0; i < 100; ++i) {
            t.start();
            t.stop();
        }
        gOverhead.store(t.accumulated_ / 100, std::memory_order_relaxed);
    }
};

namespace {

void calibrateOnce() {
    // A function-local static runs its constructor exactly once, even with racing threads.
    static TimerCalibration calibration;
    (void)calibration;
}

}  // namespace

Timer::Timer() { calibrateOnce(); }

Timer::Timer(NoCalibration) {}

int64_t Timer::now() { return Clock::now().time_since_epoch().count(); }

int64_t Timer::frequency() { return kFrequency; }

int64_t Timer::overhead() {
    calibrateOnce();
    return gOverhead.load(std::memory_order_relaxed);
}

void Timer::start(bool reset) {
    if (reset) {
        accumulated_ = 0;
        depth_ = 1;
        count_ = 1;
        start_ = now();
        return;
    }
    if (++depth_ == 1) {
        ++count_;
        start_ = now();
    }
}

double Timer::stop() {
    const int64_t t = now();
    --depth_;
    if (depth_ > 0) return 0.0;
    if (depth_ < 0) {
        message(kMsgWarning, 6, "Unmatched start()/stop() in Timer! (%d)", depth_);
        // The timer is usable again after the report.
        depth_ = 0;
        return 0.0;
    }
    const int64_t interval = t - start_;
    // The correction removes the measuring cost but never makes an interval negative.
    const int64_t corrected = interval - gOverhead.load(std::memory_order_relaxed);
    if (corrected > 0) accumulated_ += corrected;
    start_ = 0;
    return static_cast<double>(interval) / static_cast<double>(kFrequency);
}

double Timer::seconds() const {
    return static_cast<double>(accumulated_) / static_cast<double>(kFrequency);
}

void Timer::add(const Timer &other) {
    if (depth_ != 0 || other.depth_ != 0)
        message(kMsgWarning, 6, "Timer must be stopped for doing adds! (%d, %d)", depth_,
                other.depth_);
    accumulated_ += other.accumulated_;
}

std::string Timer::formatSeconds(double s) {
    if (!(s > 0.0)) s = 0.0;
    if (s > 9.0e15) s = 9.0e15;  // keeps the whole part inside 64 bits
    const int64_t whole = static_cast<int64_t>(s);
    const int64_t hours = whole / 3600;
    const int64_t minutes = (whole % 3600) / 60;
    const int64_t secs = whole % 60;
    int64_t hundredths = static_cast<int64_t>((s - static_cast<double>(whole)) * 100.0);
    if (hundredths > 99) hundredths = 99;
    char buffer[64];
    std::snprintf(buffer, sizeof buffer, "%2.2" PRId64 ":%2.2" PRId64 ":%2.2" PRId64 ".%2.2" PRId64,
                  hours, minutes, secs, hundredths);
    return buffer;
}

void Timer::format(std::string &out) const { out = formatSeconds(seconds()); }

std::string Timer::format() const { return formatSeconds(seconds()); }

}  // namespace ox
