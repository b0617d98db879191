#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "core/types.h"

namespace ox {

/// Read view of one per-vertex attribute set. A missing set is a view of one shared zero entry
/// (mask 0), so indexing it with any vertex gives zero without a branch.
template <typename T>
struct VertexSet {
    const T *data = nullptr;
    uint32_t mask = 0;

    const T &operator[](uint32_t i) const { return data[i & mask]; }
    /// True when the view shows a real set of the list (not the shared zero entry).
    bool isReal() const { return mask != 0; }
};

/// The vertices of one shape: positions as three float arrays (structure of arrays), normals,
/// optional colours, and indexed UV, tangent and bitangent sets (one tangent and one bitangent
/// set per UV set).
class VertexList {
public:
    /// Sizes every array for count vertices with the given number of UV sets (zero-filled).
    void resize(uint32_t count, uint32_t uvSets, bool colors);
    /// Drops all vertices and sets.
    void clear();

    /// Number of vertices.
    uint32_t size() const { return static_cast<uint32_t>(x_.size()); }
    /// Number of UV sets (equal to the number of tangent and of bitangent sets).
    uint32_t uvSetCount() const { return static_cast<uint32_t>(uv_.size()); }
    /// True when every vertex carries a colour.
    bool hasColors() const { return colorsOn_; }

    /// Position of vertex i.
    Vec3 position(uint32_t i) const { return {x_[i], y_[i], z_[i]}; }
    /// Sets the position of vertex i.
    void setPosition(uint32_t i, const Vec3 &p) { x_[i] = p.x, y_[i] = p.y, z_[i] = p.z; }
    /// The x, y and z position arrays (size() floats each).
    const float *px() const { return x_.data(); }
    const float *py() const { return y_.data(); }
    const float *pz() const { return z_.data(); }

    /// Normal of vertex i.
    const Vec3 &normal(uint32_t i) const { return normals_[i]; }
    Vec3 &normal(uint32_t i) { return normals_[i]; }
    /// Colour of vertex i; only valid when hasColors().
    const Color &color(uint32_t i) const { return colors_[i]; }
    Color &color(uint32_t i) { return colors_[i]; }
    /// Adds a colour of (0, 0, 0, 0) to every vertex (for results stored per vertex).
    void enableColors();

    /// UV set k; see setAccess for what an index out of range gives.
    VertexSet<Vec2> uvSet(int k) const;
    /// Tangent set k (the tangents of UV set k).
    VertexSet<Vec3> tangentSet(int k) const;
    /// Bitangent set k (the bitangents of UV set k).
    VertexSet<Vec3> bitangentSet(int k) const;

    /// Writable arrays of set k (k must be below uvSetCount()); used while a shape is built.
    Vec2 *uvData(uint32_t k) { return uv_[k].data(); }
    Vec3 *tangentData(uint32_t k) { return tangents_[k].data(); }
    Vec3 *bitangentData(uint32_t k) { return bitangents_[k].data(); }

    /// Reserves room for count vertices in every array.
    void reserve(uint32_t count);
    /// Appends one vertex: uvs holds uvSetCount() pairs; colour is used only when the list
    /// has colours; the tangent and bitangent go to set 0 (the other sets get zero).
    uint32_t append(const Vec3 &p, const Vec3 &n, const Color &color, const Vec2 *uvs,
                    const Vec3 &tangent, const Vec3 &bitangent);
    /// Appends a copy of vertex i and returns its index.
    uint32_t appendCopy(uint32_t i);
    /// Keeps only the vertices listed (strictly increasing old indices), in that order.
    void keep(const std::vector<uint32_t> &order);
    /// Copies tangent and bitangent set 0 into every other set.
    void copyFirstFrameToAllSets();
    /// Releases unused capacity.
    void shrinkToFit();

    /// Names of the UV sets, in set order (may be shorter than uvSetCount() for unnamed sets).
    const std::vector<std::string> &uvSetNames() const { return uvSetNames_; }
    void setUvSetNames(std::vector<std::string> names) { uvSetNames_ = std::move(names); }
    /// Index of the UV set of this name, or -1.
    int findUvSet(const std::string &name) const;

    /// Bytes held by the arrays (capacity, not size).
    size_t memoryBytes() const;

private:
    std::vector<float> x_, y_, z_;
    std::vector<Vec3> normals_;
    std::vector<Color> colors_;
    std::vector<std::vector<Vec2>> uv_;
    std::vector<std::vector<Vec3>> tangents_;
    std::vector<std::vector<Vec3>> bitangents_;
    std::vector<std::string> uvSetNames_;
    bool colorsOn_ = false;
};

}  // namespace ox
