#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "core/types.h"
#include "raytrace/render_stats.h"
#include "raytrace/shape.h"

namespace ox {

/// How vertex baking samples an instance (attached to the instance by the scene loader).
struct VertexBakeSamplingOptions {
    /// Sampling algorithm ("PerVertex" 0, "TriangleSubdiv" 1).
    enum Type : int32_t { kPerVertex = 0, kTriangleSubdiv = 1 };

    int32_t type = kTriangleSubdiv;
    int32_t minSamples = 2;
    int32_t maxSamples = 8;
    int32_t subDivStepSize = 0;
    float footPrintScale = 1.0f;

    bool operator==(const VertexBakeSamplingOptions &o) const = default;
};

/// One placement of a shape in the scene: its name, object-to-world matrix (row vectors,
/// translation in the last row) with the inverse, an optional material that replaces every
/// material of the shape, the RenderStats flag word and the vertex-bake sampling options.
class Instance {
public:
    /// Makes an instance; null when the shape is missing or the matrix is not finite or not
    /// invertible (the caller reports "Failed to create instance").
    static std::unique_ptr<Instance> create(std::string name, const Mtx4 &objectToWorld,
                                            const Shape *shape,
                                            const MaterialHandle *overrideMaterial, uint32_t flags);

    /// The instance name (key of light links and bake targets).
    const std::string &name() const { return name_; }
    /// The shape shown.
    const Shape &shape() const { return *shape_; }
    /// Placement and its inverse.
    const Mtx4 &objectToWorld() const { return objectToWorld_; }
    const Mtx4 &worldToObject() const { return worldToObject_; }
    /// Transforms an object-space normal to world space (by the inverse transpose).
    Vec3 normalToWorld(const Vec3 &n) const {
        const auto &m = worldToObject_.m;
        return {n.x * m[0][0] + n.y * m[0][1] + n.z * m[0][2],
                n.x * m[1][0] + n.y * m[1][1] + n.z * m[1][2],
                n.x * m[2][0] + n.y * m[2][1] + n.z * m[2][2]};
    }
    /// True when the placement mirrors (negative determinant): the winding flips in world space.
    bool mirrors() const { return objectToWorld_.determinant3() < 0.0f; }

    /// RenderStats flag word.
    uint32_t flags() const { return flags_; }
    void setFlags(uint32_t f) { flags_ = f; }
    bool hasFlag(uint32_t bit) const { return (flags_ & bit) != 0; }

    /// The replacing material, or null when the shape's own materials apply.
    const MaterialHandle *overrideMaterial() const { return override_; }
    /// The material of triangle t of the shape as this instance shows it.
    const MaterialHandle *material(uint32_t t) const {
        return override_ ? override_ : shape_->material(t);
    }

    /// Vertex-bake sampling options (null when none were attached).
    const VertexBakeSamplingOptions *vertexBakeSamplingOptions() const { return sampling_.get(); }
    void setVertexBakeSamplingOptions(std::unique_ptr<VertexBakeSamplingOptions> o) {
        sampling_ = std::move(o);
    }

    /// World box: the eight corners of the shape's box transformed (empty for an empty shape).
    BBox worldBounds() const;

private:
    Instance() = default;

    std::string name_;
    Mtx4 objectToWorld_;
    Mtx4 worldToObject_;
    const Shape *shape_ = nullptr;
    const MaterialHandle *override_ = nullptr;
    uint32_t flags_ = RenderStats::kDefault;
    std::unique_ptr<VertexBakeSamplingOptions> sampling_;
};

/// World box of an object box under a placement: the eight corners transformed.
BBox transformBox(const BBox &box, const Mtx4 &m);

}  // namespace ox
