#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "bake/uv_mesh_search.h"
#include "core/types.h"
#include "render/command.h"

/// The bilinear filter of a baked light map: background texels next to covered ones get the
/// surface resampled at their own centres, continued through the chart's edge, so that a
/// bilinear lookup at the edge of a chart never blends in background.
namespace ox {

/// Shades the surface continued beyond a chart (implemented by the bake run).
class SurfaceResampleInterface {
public:
    virtual ~SurfaceResampleInterface() = default;
    /// Shades the surface of hit (barycentrics possibly outside the triangle) for texel (x, y),
    /// one colour per source layer into out. False leaves the texel background.
    virtual bool resample(const UvHit &hit, int32_t x, int32_t y, Color *out) = 0;
};

/// The "Bilinear Filter" command. Reads the coverage layer "Z" (covered: >= 0); writes
/// "<source>_bilinear" per source and "Z_bilinear", which then replace the sources and "Z".
/// Refilled texels become covered in "Z" (their value is the index of the resampled shape).
class BilinearFilter final : public FrameCommand {
public:
    /// search and resampler must outlive the command.
    BilinearFilter(std::vector<std::string> sources, const UvMeshSearch &search,
                   SurfaceResampleInterface &resampler)
        : FrameCommand("Bilinear Filter"),
          sources_(std::move(sources)),
          search_(search),
          resampler_(resampler) {}
    using FrameCommand::execute;
    bool execute(Frame &frame, RenderContext &context, RenderIOInterface &io) override;
    /// The same without a render context.
    bool run(Frame &frame, RenderIOInterface *io);
    /// Number of texels refilled by the last run.
    int64_t refilled() const { return refilled_; }

private:
    std::vector<std::string> sources_;
    const UvMeshSearch &search_;
    SurfaceResampleInterface &resampler_;
    int64_t refilled_ = 0;
};

}  // namespace ox
