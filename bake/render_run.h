#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "core/render_io.h"
#include "core/run_statistics.h"
#include "core/types.h"

/// The run kinds the camera/bake driver loops over: camera render, texture bake, surface
/// transfer. Each owns its frame and renders one target of one pass at a time.
namespace ox {

class Frame;
struct MinMaxData;

/// Results of the run operations: 0 done, kRunHardError a hard error (the driver's status is
/// then a general failure), any other value a soft stop (the driver reports an abort).
enum RunResult : int32_t {
    kRunDone = 0,
    kRunHardError = 2,
};

/// One run of a camera render, texture bake or surface transfer. The driver calls, in order:
/// prepare, then (for each prepass: giPrepass per target), then for each pass and target:
/// setupTarget, renderTarget, statistics. Every failure is reported by the run as one message.
class HLRenderInterface {
public:
    virtual ~HLRenderInterface() = default;

    /// The passes the run's components ask for (bakes); empty when none is valid. The camera
    /// render's passes are chosen by the driver.
    virtual std::vector<std::string> componentPasses() const { return {}; }
    /// Makes the run ready for the pass list.
    virtual int32_t prepare(const std::vector<std::string> &passes) = 0;
    /// The number of targets (at least 1 after a successful prepare).
    virtual int32_t targetCount() const = 0;
    /// The name of target index (from 0); it becomes part of output file names.
    virtual std::string targetName(int32_t index) const = 0;
    /// Resolves target index and sizes the frame for it (the resolution, or the target's own
    /// size for bakes with the region reset to the whole target).
    virtual int32_t setupTarget(int32_t index) = 0;
    /// The size of the frame of the current target.
    virtual Vec2i frameSize() const = 0;
    /// The frame of the current target (null before setupTarget, or for runs without one).
    virtual Frame *frame() = 0;

    /// The number of GI prepasses the run needs (0 = none).
    virtual int32_t prepassCount() const { return 0; }
    /// Called once before the first prepass.
    virtual int32_t beginPrepasses() { return kRunDone; }
    /// Renders prepass index over the current target (after setupTarget).
    virtual int32_t giPrepass(int32_t prepass, RenderIOInterface &io) { return kRunDone; }
    /// Closes prepass index after all targets.
    virtual int32_t closePrepass(int32_t prepass) { return kRunDone; }
    /// Called once after the last prepass.
    virtual int32_t endPrepasses() { return kRunDone; }

    /// Renders pass (an index into the prepared list) over the current target into the frame.
    /// An abort through io stops between tiles and still returns kRunDone.
    virtual int32_t renderTarget(int32_t pass, RenderIOInterface &io) = 0;
    /// The colour layers pass (an index into the prepared list) leaves in the frame; the
    /// driver writes each. Empty: the layer named by the pass.
    virtual std::vector<std::string> passLayers(int32_t pass) const { return {}; }
    /// What the shape normalization of the current target's last pass found (null when the
    /// pass was not normalized); the driver writes it as XML beside the images.
    virtual const MinMaxData *minMaxData() const { return nullptr; }
    /// Asks the run to keep the layers of a target's earlier passes in its frame, so that one
    /// file can hold every pass (the multi-layer EXR). Default: ignored.
    virtual void keepPassLayers(bool keep) {}

    /// Adds what the last renderTarget counted (rays by type, samples) to the open target of
    /// statistics, and forgets it.
    virtual void statistics(RunStatistics &statistics) = 0;
};

}  // namespace ox
