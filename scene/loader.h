#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "platform/work_server.h"
#include "scene/mesh_builder.h"
#include "scene/scene.h"
#include "scene/temp_shape.h"
#include "shading/environment.h"

namespace ox {

/// What a scene load takes from the run's settings (render, environment and frame settings).
struct SceneLoadSettings {
    /// Welding (vertexMergeThreshold) and tangent frames (tsOddUVFlipping,
    /// tsVertexOrthogonalization, tsVertexNormalization).
    MeshBuildOptions mesh;
    /// The render setting bias; 0 asks for a bias from the scene's size.
    float bias = 0.005f;
    /// Threads of the work server that builds the shapes.
    int threadCount = 1;
    /// The job kind (renderType: "Render" 0, "TextureBake" 1, ... "PointCloudBake" 5).
    int32_t jobKind = 0;
    /// The environment settings.
    EnvironmentValues environment;
};

/// Loads a list of input files (scene documents and temporary mesh files) into a scene.
class SceneLoaderInterface {
public:
    virtual ~SceneLoaderInterface() = default;
    /// True on success; false with the error text (the messages are already printed). The
    /// scene is then incomplete and must not be rendered.
    virtual bool load(const std::vector<std::string> &inputs, const SceneLoadSettings &settings,
                      Scene &scene, std::string &error) = 0;
};

/// The scene loader: pre-opens the mesh files, reads the scene documents, computes the scene
/// box, makes cameras, materials, shapes (in parallel on the work server), instances, lights,
/// the light links and the ray-tracing bias.
class ZPXLoader final : public SceneLoaderInterface {
public:
    bool load(const std::vector<std::string> &inputs, const SceneLoadSettings &settings,
              Scene &scene, std::string &error) override;
};

/// The work item that builds the shape of one temporary mesh file.
class CreateTempShapeWork final : public Work {
public:
    /// Builds the shape of path into slot, resolving materials through materials.
    CreateTempShapeWork(std::string path, ShapeMaterialResolverInterface &materials,
                        const MeshBuildOptions &options, std::unique_ptr<Shape> &slot)
        : path_(std::move(path)), materials_(materials), options_(options), slot_(slot) {}

    /// A file that cannot be opened or a failed shape (a missing material, a damaged file)
    /// fails the item with its text; an empty file yields no shape and no failure.
    bool run(const std::atomic<bool> &stop, int threadIndex) override;

private:
    std::string path_;
    ShapeMaterialResolverInterface &materials_;
    MeshBuildOptions options_;
    std::unique_ptr<Shape> &slot_;
};

/// The extension of a path: the text after the last "." of its file-name part (empty if none).
std::string fileExtension(const std::string &path);

/// The automatic ray-tracing bias of a box: max(|centre|, |diagonal|) / 100000; 0 when the box
/// is empty or not finite.
float automaticBias(const BBox &box);

}  // namespace ox
