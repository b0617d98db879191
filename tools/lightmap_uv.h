#pragma once

#include <cstdint>
#include <vector>

#include "core/types.h"

/// Light-map UV layouts: charts of connected, similarly facing triangles, each projected flat
/// and packed without overlap into the unit square with a gutter of whole texels.
namespace ox {

/// Settings of a generated light-map layout.
struct LightmapOptions {
    /// Texels along each side of the light map the layout is made for.
    int resolution = 512;
    /// Empty texels kept between any two charts and between the charts and the border.
    int padding = 2;
    /// Largest angle between a triangle's normal and the normal of its chart (degrees).
    float maxChartAngleDegrees = 45.0f;
};

/// A generated layout and what it achieved.
struct LightmapLayout {
    std::vector<Vec2> cornerUVs;    ///< three per triangle, in triangle order
    std::vector<uint32_t> chartOf;  ///< chart index of each triangle
    uint32_t chartCount = 0;
    double coverage = 0.0;        ///< share of the unit square the triangles cover
    float largestStretch = 1.0f;  ///< largest ratio of the two singular values of a triangle's map
    float texelsPerUnit = 0.0f;   ///< texels per scene unit, the same in every chart
};

/// A rectangle to pack; sizes are in texels once scaled, positions come back in whole texels.
struct PackRect {
    float width = 0.0f, height = 0.0f;  ///< extent in scene units
    int32_t x = 0, y = 0;               ///< lower-left texel of the placed block
    bool rotated = false;  ///< placed turned by a quarter: width runs along v, height along u
};

/// Places the rectangles, scaled by texelsPerUnit, into a square of resolution texels so that
/// blocks of floor(size * scale) + 1 + padding texels do not overlap and leave padding texels at
/// the lower and left border. A block may be turned by a quarter when it fits lower that way.
/// Returns false when they do not fit.
bool packRectangles(std::vector<PackRect> &rects, float texelsPerUnit, int resolution, int padding);

/// Splits triangles into charts: connected over shared edges (by position), each triangle
/// within maxAngleDegrees of the chart's first triangle, with no two triangles of a chart
/// overlapping once projected onto the plane of that first triangle (its normal goes into
/// chartAxis). Returns the chart count.
uint32_t buildCharts(const std::vector<Vec3> &positions, const std::vector<uint32_t> &triangles,
                     float maxAngleDegrees, std::vector<uint32_t> &chartOf,
                     std::vector<Vec3> &chartAxis);

/// Ratio of the larger to the smaller singular value of the map from a triangle in space to
/// the same triangle in a plane (1 = no stretch; infinity for a triangle that collapses).
float triangleStretch(const Vec3 &p0, const Vec3 &p1, const Vec3 &p2, const Vec2 &q0,
                      const Vec2 &q1, const Vec2 &q2);

/// Makes a light-map layout for an indexed triangle list. Returns false with one error message
/// when the options are out of range or the charts cannot fit at the resolution.
bool generateLightmapLayout(const std::vector<Vec3> &positions,
                            const std::vector<uint32_t> &triangles, const LightmapOptions &options,
                            LightmapLayout &layout);

}  // namespace ox
