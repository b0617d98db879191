#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "core/types.h"
#include "raytrace/triangle.h"
#include "raytrace/vertex_list.h"

namespace ox {

/// What geometry knows of a material: its identity, nothing more. Triangles and instances name
/// their material through it; the shading code's materials derive from it and turn a pointer
/// back into theirs (materialOf in shading/material.h). Never deleted through this type.
class MaterialHandle {
protected:
    MaterialHandle() = default;
    ~MaterialHandle() = default;
};

/// One shape (mesh): its vertex list, its triangles, the material of every triangle (an index
/// into the shape's material slots) and its object-space bounding box. Built once by the mesh
/// builder, then read-only; shared by all instances that show it.
class Shape {
public:
    /// An empty shape of this name.
    explicit Shape(std::string name = {}) : name_(std::move(name)) {}

    /// The name instances refer to.
    const std::string &name() const { return name_; }

    /// The vertices.
    const VertexList &vertices() const { return vertices_; }
    VertexList &vertices() { return vertices_; }

    /// The triangles; triangle t has primitive identifier t.
    const std::vector<Triangle> &triangles() const { return triangles_; }
    std::vector<Triangle> &triangles() { return triangles_; }
    /// Number of triangles.
    uint32_t triangleCount() const { return static_cast<uint32_t>(triangles_.size()); }

    /// Material slots; Triangle::material indexes this list.
    const std::vector<const MaterialHandle *> &materials() const { return materials_; }
    std::vector<const MaterialHandle *> &materials() { return materials_; }
    /// The material of triangle t (null when its slot is out of range).
    const MaterialHandle *material(uint32_t t) const {
        uint32_t slot = triangles_[t].material;
        return slot < materials_.size() ? materials_[slot] : nullptr;
    }

    /// Object-space bounding box of the vertices.
    const BBox &bounds() const { return bounds_; }
    void setBounds(const BBox &b) { bounds_ = b; }
    /// Recomputes the box from the vertices (the empty box for no vertices).
    void computeBounds();

    /// Corner c (0..2) of triangle t.
    Vec3 corner(uint32_t t, int c) const { return vertices_.position(triangles_[t].v[c]); }
    /// Unnormalised face normal (p1 - p0) x (p2 - p0) of triangle t.
    Vec3 faceNormal(uint32_t t) const {
        Vec3 p0 = corner(t, 0);
        return cross(corner(t, 1) - p0, corner(t, 2) - p0);
    }
    /// Shading normal at barycentrics (u, v) of triangle t: (1-u-v) n0 + u n1 + v n2, normalised.
    Vec3 interpolatedNormal(uint32_t t, float u, float v) const {
        const Triangle &tri = triangles_[t];
        Vec3 n = vertices_.normal(tri.v[0]) * (1.0f - u - v) + vertices_.normal(tri.v[1]) * u +
                 vertices_.normal(tri.v[2]) * v;
        return n.normalize();
    }

    /// Bytes held by the vertex list and the triangle and material arrays.
    size_t memoryBytes() const;

private:
    std::string name_;
    VertexList vertices_;
    std::vector<Triangle> triangles_;
    std::vector<const MaterialHandle *> materials_;
    BBox bounds_;
};

}  // namespace ox
