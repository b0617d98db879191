#include "core/run_statistics.h"

#include <algorithm>

#include "core/message.h"

namespace ox {
namespace {

constexpr size_t kPassDepth = 1;
constexpr size_t kTargetDepth = 2;
constexpr size_t kCommandDepth = 3;

}  // namespace

RunStatistics::RunStatistics(const std::string &rootName) {
    root_.name = rootName;
    root_.timer.start(true);
    open_.push_back(&root_);
}

void RunStatistics::closeFrom(size_t depth) {
    while (open_.size() > depth && open_.size() > 1) {
        open_.back()->timer.stop();
        open_.pop_back();
    }
}

void RunStatistics::open(size_t depth, const std::string &name) {
    closeFrom(depth);
    // Missing parents are opened unnamed, so a count never gets lost.
    while (open_.size() < depth) {
        open_.back()->children.push_back(std::make_unique<Node>());
        open_.push_back(open_.back()->children.back().get());
        open_.back()->timer.start(true);
    }
    auto node = std::make_unique<Node>();
    node->name = name;
    node->timer.start(true);
    open_.back()->children.push_back(std::move(node));
    open_.push_back(open_.back()->children.back().get());
}

void RunStatistics::beginPass(const std::string &name) {
    std::lock_guard<std::mutex> lock(mutex_);
    open(kPassDepth, name);
}

void RunStatistics::endPass() {
    std::lock_guard<std::mutex> lock(mutex_);
    closeFrom(kPassDepth);
}

void RunStatistics::beginTarget(const std::string &name) {
    std::lock_guard<std::mutex> lock(mutex_);
    open(kTargetDepth, name);
}

void RunStatistics::endTarget() {
    std::lock_guard<std::mutex> lock(mutex_);
    closeFrom(kTargetDepth);
}

void RunStatistics::beginCommand(const std::string &name) {
    std::lock_guard<std::mutex> lock(mutex_);
    open(kCommandDepth, name);
}

void RunStatistics::endCommand() {
    std::lock_guard<std::mutex> lock(mutex_);
    closeFrom(kCommandDepth);
}

void RunStatistics::count(const std::string &name, uint64_t amount) {
    std::lock_guard<std::mutex> lock(mutex_);
    Node *node = open_[std::min(open_.size(), kTargetDepth + 1) - 1];
    for (auto &c : node->counters) {
        if (c.first == name) {
            c.second += amount;
            return;
        }
    }
    node->counters.emplace_back(name, amount);
}

void RunStatistics::print() {
    std::lock_guard<std::mutex> lock(mutex_);
    closeFrom(kPassDepth);
    message(kMsgBench, 6, "Statistics for this run:");
    int passNumber = 0;
    for (const auto &pass : root_.children) {
        message(kMsgBench, 6, "Pass %d: %s (%s)", ++passNumber, pass->name.c_str(),
                pass->timer.format().c_str());
        for (const auto &c : pass->counters)
            message(kMsgBench, 6, "    %s: %llu", c.first.c_str(),
                    static_cast<unsigned long long>(c.second));
        int targetNumber = 0;
        for (const auto &target : pass->children) {
            message(kMsgBench, 6, "    Target %d: %s (%s)", ++targetNumber, target->name.c_str(),
                    target->timer.format().c_str());
            for (const auto &c : target->counters)
                message(kMsgBench, 6, "    %s: %llu", c.first.c_str(),
                        static_cast<unsigned long long>(c.second));
            int commandNumber = 0;
            for (const auto &command : target->children)
                message(kMsgBench, 6, "        Command %d: %s (%s)", ++commandNumber,
                        command->name.c_str(), command->timer.format().c_str());
        }
    }
}

}  // namespace ox
