#include "config/settings_frame.h"

namespace ox {

OutputCorrectionBase::OutputCorrectionBase() : OXCComplexType("outputCorrection") {}
OutputVerbosityBase::OutputVerbosityBase() : OXCComplexType("outputVerbosity") {}
FrameSettingsBase::FrameSettingsBase() : OXCComplexType("FrameSettings") {}

}  // namespace ox
