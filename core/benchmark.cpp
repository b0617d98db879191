#include "core/benchmark.h"

#include "core/message.h"

namespace ox {
namespace {

constexpr double kMinReported = 0.001;

}  // namespace

BenchmarkRegistry::BenchmarkRegistry() {
    names_ = {"loadInputsWhileMergingBench", "mergePointBench", "flushingOutputsBench"};
}

BenchmarkRegistry &BenchmarkRegistry::instance() {
    static BenchmarkRegistry registry;
    return registry;
}

int BenchmarkRegistry::registerBenchmark(const std::string &name) {
    std::lock_guard<std::mutex> lock(mutex_);
    for (size_t i = 0; i < names_.size(); ++i)
        if (names_[i] == name) return static_cast<int>(i);
    if (names_.size() >= kMaxBenchmarks) return -1;
    names_.push_back(name);
    return static_cast<int>(names_.size() - 1);
}

int BenchmarkRegistry::find(const std::string &name) const {
    std::lock_guard<std::mutex> lock(mutex_);
    for (size_t i = 0; i < names_.size(); ++i)
        if (names_[i] == name) return static_cast<int>(i);
    return -1;
}

std::vector<std::string> BenchmarkRegistry::names() const {
    std::lock_guard<std::mutex> lock(mutex_);
    return names_;
}

BenchmarkRegistry::ThreadTimers &BenchmarkRegistry::threadTimers() {
    thread_local ThreadTimers *mine = nullptr;
    if (!mine) {
        auto timers = std::make_unique<ThreadTimers>();
        mine = timers.get();
        std::lock_guard<std::mutex> lock(mutex_);
        threads_.push_back(std::move(timers));
    }
    return *mine;
}

void BenchmarkRegistry::attachThread() { threadTimers(); }

void BenchmarkRegistry::start(int index) {
    if (index < 0 || index >= kMaxBenchmarks) return;
    threadTimers().timers[index].start();
}

void BenchmarkRegistry::stop(int index) {
    if (index < 0 || index >= kMaxBenchmarks) return;
    threadTimers().timers[index].stop();
}

double BenchmarkRegistry::totalSeconds(int index) const {
    if (index < 0 || index >= kMaxBenchmarks) return 0.0;
    std::lock_guard<std::mutex> lock(mutex_);
    double total = 0.0;
    for (const auto &t : threads_) total += t->timers[index].seconds();
    return total;
}

void BenchmarkRegistry::report() const {
    std::lock_guard<std::mutex> lock(mutex_);
    for (size_t i = 0; i < names_.size(); ++i) {
        bool any = false;
        for (const auto &t : threads_) any = any || t->timers[i].seconds() > kMinReported;
        if (!any) continue;
        const char *name = names_[i].c_str();
        message(kMsgBench, 6, "Benchmark for %s:", name);
        Timer total;
        for (const auto &t : threads_) {
            const Timer &timer = t->timers[i];
            if (timer.seconds() <= kMinReported) continue;
            total.add(timer);
            message(kMsgBench, 6, " %s: %s (%d)", "", timer.format().c_str(), timer.startCount());
        }
        if (total.seconds() <= kMinReported)
            message(kMsgBench, 6, " No benchmark activity recorded for %s", name);
        else
            message(kMsgBench, 6, " Total:    %s", total.format().c_str());
    }
}

void BenchmarkRegistry::clearTimers() {
    std::lock_guard<std::mutex> lock(mutex_);
    for (auto &t : threads_) t->timers = {};
}

}  // namespace ox
