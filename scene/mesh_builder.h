#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "core/types.h"
#include "raytrace/shape.h"

namespace ox {

/// How tangent frames are computed and cleaned (from the render settings tsOddUVFlipping,
/// tsVertexOrthogonalization and tsVertexNormalization).
struct TangentSpaceOptions {
    bool oddUVFlipping = true;
    bool orthogonalize = true;
    bool normalize = true;
};

/// Settings of one mesh build.
struct MeshBuildOptions {
    TangentSpaceOptions tangentSpace;
    /// Vertices closer than this absolute distance may be welded (render setting
    /// vertexMergeThreshold); 0 welds only vertices at exactly one position.
    float mergeThreshold = 0.001f;
    /// Normal tolerance; kept squared (normals and tangents weld below 1e-6 squared distance).
    float normalTolerance = 0.001f;
    /// Feature switches (all on for temporary meshes).
    bool weld = true;
    bool tangentFrames = true;
};

/// Counts the repairs of one shape so that each kind of warning is printed once per shape with
/// a summary of the repeats, instead of flooding the console with one line per vertex.
class RepairLog {
public:
    /// Warning kinds.
    enum Kind {
        kDegeneratedTriangle,
        kDegeneratedNormal,
        kInvalidUv,
        kDegeneratedAngle,
        kDegeneratedTangentSum,
        kDegeneratedTangent,
        kDegeneratedBitangent,
        kKindCount
    };
    /// Reports one repair: the first of a kind prints its warning.
    void report(Kind kind);
    /// Prints the repeat counts (one line per kind that repeated) for this shape.
    void summarize(const std::string &shapeName) const;
    /// How often a kind occurred.
    uint64_t count(Kind kind) const { return counts_[kind]; }

private:
    uint64_t counts_[kKindCount] = {};
};

/// The mesh builder: takes the vertex records and triangles of one shape, validates and repairs
/// them, welds vertices, computes and repairs tangent frames and produces the shape. One builder
/// per shape, used by one thread; the result does not depend on the thread that runs it.
class MeshBuilder {
public:
    /// A builder for vertices with or without colours and with uvSets UV sets.
    MeshBuilder(bool colors, uint32_t uvSets, const MeshBuildOptions &options);

    /// Reserves room; throws std::bad_alloc when the memory is not there (the caller reports it).
    void reserve(uint32_t vertices, uint64_t triangles);

    /// Adds one vertex record and returns its index; uvs holds one pair per UV set. Non-finite
    /// UVs become 0 (warning).
    uint32_t addVertex(const Vec3 &p, const Vec3 &n, const Vec3 &tangent, const Vec3 &bitangent,
                       const Color &color, const Vec2 *uvs);
    /// Whether the tangent frames of the records are used (else they are computed at finish).
    void setUseGivenFrames(bool use) { useGivenFrames_ = use; }

    /// Offers one triangle over three added vertices (indices below the vertex count) with a
    /// material slot. Returns false when it is rejected as empty or degenerated.
    bool addTriangle(uint32_t i0, uint32_t i1, uint32_t i2, uint32_t material);

    /// Number of vertices and of accepted triangles so far.
    uint32_t vertexCount() const { return verts_.size(); }
    uint32_t triangleCount() const { return static_cast<uint32_t>(tris_.size()); }

    /// Welds, computes and repairs the frames and moves the result into the shape (vertices,
    /// triangles and bounds; material slots stay the caller's). The builder is empty afterwards.
    void finish(Shape &shape, const std::string &shapeName);

    /// The repairs made so far.
    const RepairLog &repairs() const { return log_; }

private:
    void weld(std::vector<uint32_t> &remap, std::vector<uint32_t> &order);
    bool attributesMatch(uint32_t a, uint32_t b) const;
    void computeTangents();
    void repairFrames();

    MeshBuildOptions options_;
    uint32_t uvSets_;
    bool colors_;
    bool useGivenFrames_ = false;
    VertexList verts_;
    std::vector<uint8_t> badNormal_;  // per added vertex: its normal must be replaced
    std::vector<Triangle> tris_;
    RepairLog log_;
};

/// Repairs one tangent frame (normal, tangent, bitangent) in place and normalises it as the
/// options say; reports repairs to the log.
void repairTangentFrame(Vec3 &n, Vec3 &t, Vec3 &b, const TangentSpaceOptions &options,
                        RepairLog &log);

}  // namespace ox
