#pragma once

#include <cstdint>
#include <cstring>
#include <vector>

#include "pointcloud/point_cloud.h"

/// Point clouds with awkward but deterministic contents, for the round-trip tests.
namespace oxtest {

/// The factories of every sample kind (array kinds with three values per channel).
inline std::vector<ox::PointSampleFactory> everyKind() {
    std::vector<ox::PointSampleFactory> kinds;
    for (uint32_t id = 0; id < ox::kPointKindCount; ++id) kinds.emplace_back(ox::PointKind(id), 3);
    return kinds;
}

/// A cloud of `points` samples whose values cover signs, zeros, denormals, extremes and
/// fractions that short decimal forms would not keep; `seed` varies them.
inline ox::PointCloud sampleCloud(const ox::PointSampleFactory &factory, uint64_t points,
                                  uint32_t seed = 1) {
    static const float kFloats[] = {
        0.1f,        -0.0f,       1e-40f, 3.4028235e38f, -1.17549435e-38f,
        1.0f / 3.0f, 123456.789f, -2.5f,  16777217.0f,   7e-45f,
        0.0f,        -1e30f};
    ox::PointCloud cloud = factory.create();
    cloud.header().description = "test cloud";
    cloud.header().objectToWorld.m[3][0] = 0.3f;
    cloud.header().objectToWorld.m[1][2] = -1.0f / 7.0f;
    EXPECT_TRUE(cloud.resize(points));
    uint32_t h = seed * 2654435761u;
    for (uint64_t i = 0; i < points; ++i)
        for (const ox::PointVariable &v : cloud.variables())
            for (uint32_t e = 0; e < v.count; ++e) {
                h = h * 1664525u + 1013904223u;
                if (v.type == ox::PointDataType::Float) {
                    float f = kFloats[(h >> 8) % std::size(kFloats)];
                    if ((h >> 4) & 1) f *= 1.0f + float(i) * 1e-3f;
                    cloud.setFloat(i, v, e, f);
                } else {
                    cloud.setInt(i, v, e, int64_t(int32_t(h)));
                }
            }
    cloud.updateBounds();
    return cloud;
}

}  // namespace oxtest
