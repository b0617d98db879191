#pragma once

#include <cstdint>

namespace ox {

/// The run succeeded.
constexpr int32_t kStatusSuccess = 0;
/// General failure (scene not loaded, hard command error, missing file without an error code).
constexpr int32_t kStatusFailure = 0x20000000;
/// Command-line syntax error (usage printed).
constexpr int32_t kStatusSyntaxError = 0x20000002;
/// The configuration file could not be loaded.
constexpr int32_t kStatusConfigLoad = 0x20000003;
/// Unsupported combination, or an action without a driver.
constexpr int32_t kStatusUnsupported = 0x20000004;
/// A region or image merge without input images.
constexpr int32_t kStatusNoMergeInputs = 0x20000005;
/// The bake target named for a merge does not exist.
constexpr int32_t kStatusNoMergeTarget = 0x20000007;
/// A bake or surface-transfer target with a zero dimension.
constexpr int32_t kStatusZeroDimension = 0x20000008;
/// A render region without area, or an unreadable or unfitting merge input image.
constexpr int32_t kStatusBadRegionOrImage = 0x20000009;
/// No valid render components for the chosen bake.
constexpr int32_t kStatusNoComponents = 0x2000000A;
/// An image could not be written.
constexpr int32_t kStatusImageWrite = 0x2000000C;
/// UV packing failed.
constexpr int32_t kStatusUvPack = 0x2000000D;
/// The run was aborted through the progress object.
constexpr int32_t kStatusAborted = 1223;
/// A crash ended a run started with -cs.
constexpr int32_t kStatusCrash = static_cast<int32_t>(0xC0000005u);

/// The status of a failure whose platform error code is code: the code itself, or
/// kStatusFailure when the platform gave none.
constexpr int32_t statusFromPlatformError(int code) { return code != 0 ? code : kStatusFailure; }

/// The 8-bit process exit code of a run status: 0x200000NN gives NN for the listed codes,
/// 1223 gives 199, a crash 139, a platform error code from 1 to 255 itself, everything else 1.
int processExitCode(int32_t status);

}  // namespace ox
