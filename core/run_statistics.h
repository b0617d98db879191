#pragma once

#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

#include "core/timer.h"

namespace ox {

/// The statistics of one run: a timed tree root → pass → target → command with named 64-bit
/// counters, printed at the end of the run as benchmark messages.
class RunStatistics {
public:
    /// One timed node of the tree.
    struct Node {
        std::string name;                                        ///< as given when opened
        Timer timer;                                             ///< time while open
        std::vector<std::pair<std::string, uint64_t>> counters;  ///< in order of first use
        std::vector<std::unique_ptr<Node>> children;             ///< in order of opening
    };

    /// A tree whose root (normally "Vorn") starts timing now.
    explicit RunStatistics(const std::string &rootName = "Vorn");

    /// Closes any open pass and opens a new pass node.
    void beginPass(const std::string &name);
    /// Closes the open pass (and its target and command).
    void endPass();
    /// Closes any open target and opens a target node in the open pass (an unnamed pass is
    /// opened when none is).
    void beginTarget(const std::string &name);
    /// Closes the open target (and its command).
    void endTarget();
    /// Closes any open command and opens a command node in the open target.
    void beginCommand(const std::string &name);
    /// Closes the open command.
    void endCommand();
    /// Adds amount to the named counter of the open target (of the open pass, or the root, when
    /// no target is open). Thread-safe.
    void count(const std::string &name, uint64_t amount = 1);
    /// Closes every open node and prints the tree.
    void print();

    /// The root node (read it when no other thread records).
    const Node &root() const { return root_; }

private:
    void closeFrom(size_t depth);
    void open(size_t depth, const std::string &name);

    std::mutex mutex_;
    Node root_;
    // open_[0] is the root; open_[1] the pass, open_[2] the target, open_[3] the command.
    std::vector<Node *> open_;
};

}  // namespace ox
