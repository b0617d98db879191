#pragma once

/// What the commands of one command list share besides the frame.
namespace ox {

/// The context a command list runs in: how many threads its filters may use.
class RenderContext {
public:
    /// Threads a filter may run rows on (the run's render threads).
    int threadCount = 1;
};

}  // namespace ox
