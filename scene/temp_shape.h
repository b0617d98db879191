#pragma once

#include <memory>
#include <string>
#include <vector>

#include "raytrace/shape.h"
#include "scene/mesh_builder.h"
#include "shading/material.h"
#include "scene/vtm.h"

namespace ox {

/// Turns the material names of a mesh file into the materials of one shape (the loader's
/// material table; the shape's UV-set names let a material resolve its UV-set overrides).
/// Called from several threads at once.
class ShapeMaterialResolverInterface {
public:
    virtual ~ShapeMaterialResolverInterface() = default;
    /// The material of this name as the shape uses it, or null when no such material exists.
    virtual const Material *resolve(const std::string &name,
                                    const std::vector<std::string> &uvSetNames) = 0;
};

/// Result of building one shape from a mesh file.
enum class ShapeBuildStatus {
    kBuilt,   ///< the shape was made
    kEmpty,   ///< the file holds nothing to build; no shape, no failure
    kFailed,  ///< the shape failed; the failure text says why (already reported as an error)
};

/// Builds the shape of an opened mesh file (its header already read): resolves the materials
/// (a mesh without groups uses "default"), reads the vertex records and triangles, feeds them
/// through the mesh builder and returns the finished shape.
ShapeBuildStatus buildTempShape(vtm::VornTempMeshBase &reader,
                                ShapeMaterialResolverInterface &materials,
                                const MeshBuildOptions &options, std::unique_ptr<Shape> &shape,
                                std::string &failure);

}  // namespace ox
