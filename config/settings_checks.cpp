#include "config/settings_checks.h"

#include <algorithm>
#include <cstdint>

namespace ox {
namespace {

/// Resets `value` to `fallback` with a warning naming the key; true when it was reset.
bool resetVec2i(OXCType<Vec2i> &value, const OXCType<Vec2i> &fallback, const char *type) {
    const Vec2i v = value.get();
    if (v.x > 0 && v.y > 0) return false;
    const Vec2i d = fallback.get();
    message(kMsgWarning, 6, "%s %s is (%d, %d), it must be positive; using the default (%d, %d)",
            type, value.name().c_str(), v.x, v.y, d.x, d.y);
    value = d;
    return true;
}

bool resetVec2(OXCType<Vec2> &value, const OXCType<Vec2> &fallback, const char *type) {
    const Vec2 v = value.get();
    if (v.x > 0.0f && v.y > 0.0f) return false;  // NaN fails too
    const Vec2 d = fallback.get();
    message(kMsgWarning, 6, "%s %s is (%g, %g), it must be positive; using the default (%g, %g)",
            type, value.name().c_str(), double(v.x), double(v.y), double(d.x), double(d.y));
    value = d;
    return true;
}

/// `ok` tells whether the current value is usable.
bool resetFloat(OXCType<float> &value, const OXCType<float> &fallback, const char *type, bool ok,
                const char *rule) {
    if (ok) return false;
    message(kMsgWarning, 6, "%s %s is %g, it must be %s; using the default %g", type,
            value.name().c_str(), double(value.get()), rule, double(fallback.get()));
    value = fallback.get();
    return true;
}

bool resetUInt(OXCType<uint32_t> &value, const OXCType<uint32_t> &fallback, const char *type,
               bool ok, const char *rule) {
    if (ok) return false;
    message(kMsgWarning, 6, "%s %s is %u, it must be %s; using the default %u", type,
            value.name().c_str(), value.get(), rule, fallback.get());
    value = fallback.get();
    return true;
}

}  // namespace

int checkLoadedSettings(OXConfigBase &config) {
    static const OXConfig kDefaults;
    FrameSettingsBase &frame = config.FrameSettings;
    const FrameSettingsBase &frame0 = kDefaults.FrameSettings;
    RenderSettingsBase &render = config.RenderSettings;
    const RenderSettingsBase &render0 = kDefaults.RenderSettings;
    ADSSettingsBase &ads = config.ADSSettings;
    const ADSSettingsBase &ads0 = kDefaults.ADSSettings;
    const char *kFrame = "FrameSettings";

    int reset = 0;
    reset += resetVec2i(frame.tileSize, frame0.tileSize, kFrame);
    reset += resetVec2i(frame.resolution, frame0.resolution, kFrame);
    const float gamma = frame.outputCorrection.gamma();
    reset += resetFloat(frame.outputCorrection.gamma, frame0.outputCorrection.gamma,
                        "outputCorrection", gamma > 0.0f && gamma < 3.0e38f, "positive");
    reset += resetVec2(config.AASettings.filterSize, kDefaults.AASettings.filterSize, "AASettings");
    const float bias = render.bias();
    reset += resetFloat(render.bias, render0.bias, "RenderSettings", bias >= 0.0f && bias < 3.0e38f,
                        "zero or positive");
    reset += resetUInt(render.motionSteps, render0.motionSteps, "RenderSettings",
                       render.motionSteps() > 0, "at least 1");
    const float density = ads.gridDensity();
    reset += resetFloat(ads.gridDensity, ads0.gridDensity, "ADSSettings",
                        density > 0.0f && density < 3.0e38f, "positive");
    reset += resetUInt(ads.gridMaxDepth, ads0.gridMaxDepth, "ADSSettings", ads.gridMaxDepth() <= 16,
                       "at most 16");
    return reset;
}

Region renderRegion(const FrameSettingsBase &frame) {
    const Vec2i res = frame.resolution();
    if (!frame.regionRender()) return Region(0, 0, std::max(res.x, 0), std::max(res.y, 0));
    const Vec2i lo = frame.regionLowerLeft();
    const Vec2i hi = frame.regionTopRight();
    Region r(std::max(lo.x, 0), std::max(lo.y, 0), std::min(hi.x, res.x), std::min(hi.y, res.y));
    if (r.xMax <= r.xMin || r.yMax <= r.yMin) return Region();
    return r;
}

OutputVerbosityFlags verbosityFlags(const OutputVerbosityBase &verbosity) {
    OutputVerbosityFlags flags;
    flags.errorPrint = verbosity.errorPrint();
    flags.warningPrint = verbosity.warningPrint();
    flags.debugPrint = verbosity.debugPrint();
    flags.verbosePrint = verbosity.verbosePrint();
    flags.progressPrint = verbosity.progressPrint();
    flags.benchmarkPrint = verbosity.benchmarkPrint();
    flags.infoPrint = verbosity.infoPrint();
    flags.debugFile = verbosity.debugFile();
    return flags;
}

}  // namespace ox
