#pragma once

#include <string>

namespace ox {

/// Progress reporting and abort control of one run, shared by the driver, the render threads and
/// a display. Implementations are thread-safe.
class RenderIOInterface {
public:
    virtual ~RenderIOInterface() = default;

    /// True once the run has been aborted; cheap enough to ask between tiles.
    virtual bool isAborted() const = 0;
    /// True while a display may let go of the current result (set by release()).
    virtual bool isReleased() = 0;
    /// Names the phase that the following progress reports belong to.
    virtual void setProgressTitle(const std::string &title) = 0;
    /// A command of the command list starts.
    virtual void beginCommand() = 0;
    /// A command of the command list has ended.
    virtual void endCommand() = 0;
    /// The phase is complete: reports the remaining progress marks (or the abort).
    virtual void finish() = 0;
    /// Reports the completed fraction (0 to 1) of the current phase.
    virtual void setProgress(float fraction) = 0;
    /// Asks every worker to stop between steps; never undone.
    virtual void abort() = 0;
    /// Lets a waiting display go.
    virtual void release() = 0;
    /// Clears the release flag after a finished target step.
    virtual void clearRelease() = 0;
    /// Tells an attached display that the frame changed; the console has nothing to redraw.
    virtual void refreshDisplay() = 0;
};

}  // namespace ox
