#pragma once

#include "config/ox_config.h"
#include "core/message.h"
#include "core/types.h"

/// What the run derives from the loaded configuration: the checks of numeric keys that would
/// break a run, the render region and the message switches.
namespace ox {

/// Checks the keys that would break a run (tile size, resolution, filter size, output gamma and
/// grid density not positive, negative bias, motion steps 0, grid depth above 16); each bad key
/// gets one warning and its default back. Returns the number of keys reset.
int checkLoadedSettings(OXConfigBase &config);

/// The pixels a camera render covers: the whole resolution, or with regionRender the region
/// [regionLowerLeft, regionTopRight) clipped to it. An empty region (valid false) when nothing
/// of the frame remains.
Region renderRegion(const FrameSettingsBase &frame);

/// The message switches of the outputVerbosity settings.
OutputVerbosityFlags verbosityFlags(const OutputVerbosityBase &verbosity);

}  // namespace ox
