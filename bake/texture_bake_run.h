#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "bake/bake_sample.h"
#include "bake/bake_target.h"
#include "bake/render_run.h"
#include "bake/uv_mesh_search.h"
#include "config/ox_config.h"
#include "render/frame.h"
#include "render/post_filter.h"

/// The texture-bake run: for every pass and target it renders the target's light map in
/// texture space with the tile renderer, then runs the target's filter chain.
///
/// Layers of a target's frame after renderTarget: "Z" (coverage: the index of the bake shape
/// of a covered texel, -1 for background) and one colour layer per output of the pass, named
/// by the output (the pass name for single-output passes). With keepPassLayers on, a target's
/// frame keeps the layers of its earlier passes, so that one file can hold them all.
namespace ox {

class RenderPass;
class RenderWorld;

/// Counts of one target and pass, for the statistics and the benchmark.
struct TextureBakeCounts {
    uint64_t texels = 0;       ///< texels whose centre (or square) found a surface
    uint64_t samples = 0;      ///< shaded samples, the adaptive ones included
    uint64_t edgeTexels = 0;   ///< texels that took adaptive samples
    uint64_t rays = 0;         ///< rays traced by shading (shadow and secondary rays)
    double renderSeconds = 0;  ///< time in the tile render
    double filterSeconds = 0;  ///< time in the filter chain
};

/// The texture-bake run of one configuration over a loaded world.
class TextureBakeRun final : public HLRenderInterface {
public:
    /// world and config outlive the run; threads is the number of render threads.
    TextureBakeRun(const RenderWorld &world, const OXConfigBase &config, int32_t threads);
    ~TextureBakeRun() override;

    std::vector<std::string> componentPasses() const override;
    /// No passes: "No output specified, aborting baking" (2); no targets: "No targets
    /// specified, aborting baking" (2); a bad target or an unknown pass: an error (2).
    int32_t prepare(const std::vector<std::string> &passes) override;
    int32_t targetCount() const override;
    std::string targetName(int32_t index) const override;
    /// Resolves the target the first time it is asked for (shapes, UV range, search) and
    /// keeps that for later passes; reports overlapping UV triangles once.
    int32_t setupTarget(int32_t index) override;
    Vec2i frameSize() const override;
    Frame *frame() override;
    int32_t renderTarget(int32_t pass, RenderIOInterface &io) override;
    void statistics(RunStatistics &statistics) override;
    std::vector<std::string> passLayers(int32_t pass) const override;
    void keepPassLayers(bool keep) override { keepPassLayers_ = keep; }

    /// The shape normalization's record of the current target's last pass (null when the
    /// pass was not normalized).
    const MinMaxData *minMaxData() const override;

    /// The counts of the last renderTarget.
    const TextureBakeCounts &lastCounts() const { return last_; }
    /// The counts of the whole run.
    const TextureBakeCounts &totalCounts() const { return total_; }

    struct Target;
    struct Shared;

private:
    bool renderPass(Target &target, int32_t pass, RenderIOInterface &io);
    /// True when pass is a monochrome radiosity normal map, whose three basis layers the
    /// chain folds into two.
    bool foldsRnm(const RenderPass &pass) const;

    const RenderWorld &world_;
    const OXConfigBase &config_;
    int32_t threads_;
    std::vector<std::string> passes_;
    std::vector<RenderPass *> passObjects_;
    std::unique_ptr<Shared> shared_;
    std::vector<std::unique_ptr<Target>> targets_;
    int32_t current_ = -1;
    bool keepPassLayers_ = false;
    TextureBakeCounts last_, total_;
};

}  // namespace ox
