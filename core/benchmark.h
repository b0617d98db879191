#pragma once

#include <array>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "core/timer.h"

namespace ox {

/// Index of the benchmark "loadInputsWhileMergingBench" (point-cloud merges).
constexpr int kLoadInputsWhileMergingBench = 0;
/// Index of the benchmark "mergePointBench" (point-cloud merges).
constexpr int kMergePointBench = 1;
/// Index of the benchmark "flushingOutputsBench" (point-cloud merges).
constexpr int kFlushingOutputsBench = 2;

/// The process-wide registry of named benchmarks: each thread records into its own timers (no
/// lock), the report sums them per benchmark.
class BenchmarkRegistry {
public:
    /// How many benchmarks can be registered.
    static constexpr int kMaxBenchmarks = 32;

    /// The registry, with the three merge benchmarks registered first.
    static BenchmarkRegistry &instance();

    /// Registers a benchmark and returns its index; a known name returns its existing index,
    /// a full registry returns -1.
    int registerBenchmark(const std::string &name);
    /// The index of a registered name, or -1.
    int find(const std::string &name) const;
    /// The registered names in registration order.
    std::vector<std::string> names() const;

    /// Gives the calling thread its timers now (otherwise on its first start).
    void attachThread();
    /// Starts benchmark index on the calling thread's timer.
    void start(int index);
    /// Stops benchmark index on the calling thread's timer.
    void stop(int index);
    /// Seconds summed over all threads for a benchmark (read when the recording threads rest).
    double totalSeconds(int index) const;
    /// Prints the summary as benchmark messages.
    void report() const;
    /// Clears every timer of every thread (for a new run in the same process).
    void clearTimers();

private:
    struct ThreadTimers {
        std::array<Timer, kMaxBenchmarks> timers;
    };

    BenchmarkRegistry();
    ThreadTimers &threadTimers();

    mutable std::mutex mutex_;
    std::vector<std::string> names_;
    // Kept after their threads end, so a report sees the work of finished threads.
    std::vector<std::unique_ptr<ThreadTimers>> threads_;
};

/// Times a benchmark on the calling thread for the lifetime of the object.
class ScopedBenchmark {
public:
    /// Starts benchmark index.
    explicit ScopedBenchmark(int index) : index_(index) {
        BenchmarkRegistry::instance().start(index_);
    }
    ~ScopedBenchmark() { BenchmarkRegistry::instance().stop(index_); }
    ScopedBenchmark(const ScopedBenchmark &) = delete;
    ScopedBenchmark &operator=(const ScopedBenchmark &) = delete;

private:
    int index_;
};

}  // namespace ox
