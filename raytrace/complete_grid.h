#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "core/types.h"
#include "raytrace/grid.h"
#include "raytrace/ray.h"
#include "raytrace/triangle.h"

namespace ox {

class MotionBlurHandler;

/// The query interface of the built acceleration structure.
class ADSInterface {
public:
    virtual ~ADSInterface();
    /// Closest hit with 1e-6 < t < tmax; counts the ray in counter (may be null).
    virtual bool intersect(const Ray &ray, Hit &hit, float tmax, RayCounter *counter) const = 0;
    /// Closest hit without a distance limit.
    virtual bool intersect(const Ray &ray, Hit &hit, RayCounter *counter) const {
        return intersect(ray, hit, kInfiniteDistance, counter);
    }
    /// Closest hit in the second structure kept beside the main one.
    virtual bool intersectSecond(const Ray &ray, Hit &hit, float tmax,
                                 RayCounter *counter) const = 0;
    /// Bounding box of the scene.
    virtual BBox bounds() const = 0;
    /// True when anything visible to the ray's type lies at 1e-6 < t < tmax (any hit, early exit).
    virtual bool occluded(const Ray &ray, float tmax, RayCounter *counter) const = 0;
};

/// How instances are chosen for instancing (values as the settings number them).
enum GridInstancing : int {
    kInstancingNever = 0,
    kInstancingAutoDetect = 1,
    kInstancingAlways = 2
};

/// The settings of the acceleration structure, as plain values.
struct ADSParameters {
    uint32_t gridMaxDepth = 4;
    uint32_t gridThreshold = 25;
    float gridDensity = 1.0f;
    bool useSSE = true;
    int useInstancing = kInstancingAutoDetect;
    uint32_t instancingThreshold = 500;
    /// Instances with one of these flag bits also go into the second structure.
    uint32_t secondStructureMask = kFlagEnvelop;
};

/// Object-space triangle mesh as the grid reads it (borrowed, not copied): positions either as
/// Vec3 (positions) or as three float arrays (px, py, pz); triangle i has its corner indices
/// either in a shape's triangles (triangles[i].v) or at indices[i * 3 + 0..2].
struct MeshInput {
    const Vec3 *positions = nullptr;
    const float *px = nullptr, *py = nullptr, *pz = nullptr;
    size_t vertexCount = 0;
    const Triangle *triangles = nullptr;
    const uint32_t *indices = nullptr;
    size_t triangleCount = 0;

    /// True when the position and index arrays are present (or there are no triangles).
    bool usable() const {
        return triangleCount == 0 || ((triangles || indices) && (positions || (px && py && pz)));
    }
    /// Position of vertex i.
    Vec3 position(size_t i) const { return positions ? positions[i] : Vec3(px[i], py[i], pz[i]); }
    /// Corner c of triangle t.
    uint32_t corner(size_t t, int c) const {
        return triangles ? triangles[t].v[c] : indices[t * 3 + c];
    }
};

/// One scene instance as handed to the grid.
struct InstanceInput {
    std::string name;
    uint64_t shape = 0;  ///< Shape identity: instances of one shape share it.
    MeshInput mesh;
    Mtx4 objectToWorld;
    uint32_t flags = 0;                 ///< RenderStats flag word.
    uint32_t index = kNoInstance;       ///< Scene instance index reported in hits.
    bool displaced = false;             ///< Material uses render-time displacement.
    std::vector<Mtx4> stepTransforms;   ///< Per-step placements (motion), or empty.
    std::vector<MeshInput> stepMeshes;  ///< Per-step deformed meshes (same topology), or empty.
};

class Instance;
/// The grid's view of a scene instance: its shape's vertices and triangles, placement and flags.
/// Instances of the same shape object share the shape identity. index: the scene instance index.
InstanceInput instanceInput(const Instance &instance, uint32_t index);

/// The acceleration structure of a scene: one top-level Grid over the scene's primitives, shape
/// grids reached through instance grids, and a second structure.
class CompleteGrid final : public ADSInterface {
public:
    CompleteGrid();
    ~CompleteGrid() override;

    /// Builds over the instances. False (with the error message) when the scene box is broken.
    bool build(const std::vector<InstanceInput> &instances, const ADSParameters &params,
               const MotionBlurHandler *motion = nullptr);

    bool intersect(const Ray &ray, Hit &hit, float tmax, RayCounter *counter) const override;
    using ADSInterface::intersect;
    bool intersectSecond(const Ray &ray, Hit &hit, float tmax, RayCounter *counter) const override;
    BBox bounds() const override { return box_; }
    bool occluded(const Ray &ray, float tmax, RayCounter *counter) const override;

    /// Whether the instance was chosen for instancing (before the displacement/motion copy rule).
    static bool choosesInstancing(int useInstancing, uint32_t instancingThreshold, size_t shapeUses,
                                  size_t shapeTriangles);

    /// Number of primitives in the top-level store (triangles, moving triangles, instances).
    size_t primitiveCount() const;
    /// Number of instance-grid primitives.
    size_t shapeGridCount() const { return store_.instances.size(); }
    /// Number of shape base grids built.
    size_t shapeBaseGridCount() const { return shapes_.size(); }
    /// Bytes held by the structure (grids, stores, shape grids).
    size_t sizeBytes() const;
    /// First of the (steps + 1) * 3 corners of a moving triangle (Hit::primitive when moving).
    const Vec3 &motionCorners(const MotionTriangle &m) const {
        return store_.motionCorners[m.firstCorner];
    }
    /// The top-level grid.
    const Grid &grid() const { return grid_; }

private:
    struct ShapeGrid {
        PrimitiveStore store;
        Grid grid;
    };
    bool buildStructure(const std::vector<InstanceInput> &instances, const ADSParameters &params,
                        const MotionBlurHandler *motion);
    template <bool kAny>
    bool query(const Grid &grid, const PrimitiveStore &store, const Ray &ray, Hit *hit, float tmax,
               RayCounter *counter) const;

    PrimitiveStore store_, secondStore_;
    Grid grid_, second_;
    std::vector<std::unique_ptr<ShapeGrid>> shapes_;
    BBox box_;
};

}  // namespace ox
