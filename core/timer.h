#pragma once

#include <cstdint>
#include <string>

namespace ox {

/// A high-resolution stopwatch that accumulates intervals; nested starts are counted, not timed
/// twice. The first timer of the process calibrates the per-interval overhead.
class Timer {
public:
    /// A stopped timer with nothing accumulated.
    Timer();

    /// Starts an interval; with reset, forgets everything accumulated first. A start while
    /// running only deepens the nesting.
    void start(bool reset = false);
    /// Ends the interval opened by the matching start; returns its seconds (0 while still nested
    /// or for an unmatched stop, which is reported as a warning).
    double stop();
    /// Accumulated seconds, corrected by the calibrated overhead.
    double seconds() const;
    /// Accumulated ticks.
    int64_t ticks() const { return accumulated_; }
    /// How many outermost intervals were started.
    int32_t startCount() const { return count_; }
    /// Current nesting depth (0 = stopped).
    int32_t depth() const { return depth_; }
    /// Adds another timer's accumulated time (both should be stopped; a warning otherwise).
    void add(const Timer &other);
    /// The accumulated time as "hh:mm:ss.hh".
    void format(std::string &out) const;
    /// The accumulated time as "hh:mm:ss.hh".
    std::string format() const;

    /// Formats a number of seconds as "hh:mm:ss.hh" (hours may have more digits).
    static std::string formatSeconds(double seconds);
    /// Counter ticks per second.
    static int64_t frequency();
    /// Ticks that one start/stop pair costs, measured once per process.
    static int64_t overhead();
    /// The counter now, in ticks.
    static int64_t now();

private:
    struct NoCalibration {};
    explicit Timer(NoCalibration);
    friend struct TimerCalibration;

    int64_t accumulated_ = 0;
    int64_t start_ = 0;
    int32_t depth_ = 0;
    int32_t count_ = 0;
};

/// Starts a timer on construction and stops it on destruction.
class ScopedTimer {
public:
    /// Starts timer (without reset).
    explicit ScopedTimer(Timer &timer) : timer_(timer) { timer_.start(); }
    ~ScopedTimer() { timer_.stop(); }
    ScopedTimer(const ScopedTimer &) = delete;
    ScopedTimer &operator=(const ScopedTimer &) = delete;

private:
    Timer &timer_;
};

}  // namespace ox
