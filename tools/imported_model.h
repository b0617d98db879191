#pragma once

#include <cstdint>
#include <string>
#include <unordered_set>
#include <vector>

#include "core/types.h"

/// A model brought in by thevorn-import, held in the scene's own terms before it is written:
/// shapes (one temporary mesh each), materials, instances, cameras and lights.
namespace ox {

/// One material group of a shape: a material name and its triangles (three indices each).
struct ImportedGroup {
    std::string material;
    std::vector<uint32_t> indices;
};

/// An indexed triangle mesh with per-vertex attributes; every attribute array has one entry
/// per vertex (colours: none at all, or one per vertex).
struct ImportedShape {
    std::string name;
    std::vector<Vec3> positions, normals, tangents, bitangents;
    std::vector<Color> colors;
    std::vector<std::string> uvSetNames;
    std::vector<std::vector<Vec2>> uvSets;
    std::vector<ImportedGroup> groups;

    /// Box of the positions that triangles use (the empty box when there are none).
    BBox bounds() const;
    /// Number of triangles over all groups.
    size_t triangleCount() const;
    /// True when the vertices carry colours.
    bool hasColors() const { return !colors.empty(); }
};

/// One texture channel of a material, as the scene file stores it.
struct ImportedChannel {
    Color color;
    float scale = 0.0f;
    std::string fileTexture;
    bool useVertexColor = false;
    std::string uvLayerOverride;
    /// Index into ImportedModel::images when the texture is stored inside the model, else -1;
    /// fileTexture is then set when the image is written.
    int embeddedImage = -1;
};

/// A texture stored inside the model file; it is written beside the scene as its own file.
struct ImportedImage {
    std::string fileName;  ///< name in the output's "textures" folder
    std::string bytes;     ///< the file's contents (as stored, or a TGA for raw texels)
};

/// A material in the scene file's terms; the channels keep the scene's order.
struct ImportedMaterial {
    std::string name;
    bool twosided = true;
    bool diffuseAlphaAsTransparency = false;
    float shininess = 1.0f;
    ImportedChannel diffuse, ambient, transparency, emissive, specular, reflection, normal;
};

/// One placement of a shape.
struct ImportedInstance {
    std::string name;
    std::string shape;
    Mtx4 objectToWorld;
};

/// Camera kinds as the scene file numbers them.
enum class ImportedCameraType : int { kPerspective = 0, kOrtho = 1, kEnvironment = 2 };

/// A camera: rows of the matrix are right, up, backward (it looks along -row 2) and position.
struct ImportedCamera {
    std::string name;
    ImportedCameraType type = ImportedCameraType::kPerspective;
    Vec2 fov{1.0f, 1.0f};
    Vec2 imagePlaneSize{10.0f, 10.0f};
    Mtx4 objectToWorld;
};

/// Light kinds as the scene file numbers them.
enum class ImportedLightType : int {
    kPoint = 0,
    kDirectional = 1,
    kSpot = 2,
    kArea = 3,
    kWindow = 4,
    kEnvironment = 5
};

/// A light. Directional and spot lights shine along their local -y axis; area lights cover the
/// local square from -1 to 1 in x and y and shine along local +z.
struct ImportedLight {
    std::string name;
    ImportedLightType type = ImportedLightType::kPoint;
    Color color;
    float falloffExponent = 0.0f;
    float coneAngleDegrees = 0.0f;
    float penumbraAngleDegrees = 0.0f;
    Mtx4 objectToWorld;
};

/// Everything a model holds, in the order it will be written.
struct ImportedModel {
    std::vector<ImportedShape> shapes;
    std::vector<ImportedMaterial> materials;
    std::vector<ImportedInstance> instances;
    std::vector<ImportedCamera> cameras;
    std::vector<ImportedLight> lights;
    std::vector<ImportedImage> images;
};

/// Fills the tangent and bitangent of every vertex whose tangent is zero: from UV set 0 where
/// the shape has one (weighted by the corner angles), else any frame perpendicular to the normal.
void completeTangentFrames(ImportedShape &shape);

/// Adds a UV set given per triangle corner (three entries per triangle, groups in order).
/// Vertices whose corners get different coordinates are split, so the other sets stay intact.
void appendCornerUVSet(ImportedShape &shape, const std::string &name,
                       const std::vector<Vec2> &cornerUVs);

/// A name not yet in taken, made from base by appending "_2", "_3", ...; it is added to taken.
std::string uniqueName(const std::string &base, std::unordered_set<std::string> &taken);

}  // namespace ox
