#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>

#include "tools/imported_model.h"

/// Reading model files of the formats the Open Asset Import Library knows into an ImportedModel.
namespace ox {

/// Which axis of the model file points up; the scene's up axis is +y.
enum class UpAxis { kY, kZ, kX };

/// How a model is brought into the scene's units and axes.
struct ImportOptions {
    /// Scene units per model unit (0.01 turns centimetres into metres).
    float unitScale = 1.0f;
    /// The model's up axis; it is turned onto +y.
    UpAxis upAxis = UpAxis::kY;
    /// Mirrors z for models made in a left-handed system (the triangle winding follows).
    bool flipHandedness = false;
    /// Put in front of every shape, material, instance, camera and light name.
    std::string namePrefix;
    /// Joins identical vertices; off keeps every face corner a vertex of its own.
    bool weld = true;
    /// Largest angle between faces that share a normal when normals are made (degrees).
    float smoothingAngleDegrees = 60.0f;
    /// Called now and then with the share read so far (0 to 1); may be empty.
    std::function<void(float)> progress;
};

/// What was repaired or dropped while reading; the counts go into warnings.
struct ImportStats {
    uint64_t badIndexFaces = 0;         ///< faces that named a vertex that does not exist
    uint64_t nonFiniteFaces = 0;        ///< faces with a NaN or infinite corner
    uint64_t polygonsTriangulated = 0;  ///< faces of more than three corners
    uint64_t pointsAndLines = 0;        ///< faces of one or two corners (dropped)
    uint64_t hugePolygons = 0;          ///< faces of more corners than can be triangulated
    uint64_t emptyMeshes = 0;           ///< meshes with no triangle left
    uint64_t missingTextures = 0;       ///< texture files that were not found
    uint64_t unsupportedLights = 0;     ///< lights of a kind the scene cannot show
    uint64_t embeddedTextures = 0;      ///< images stored inside the model (written as files)
};

/// The row-vector matrix that takes model coordinates to scene coordinates under the options.
Mtx4 conversionMatrix(const ImportOptions &options);

/// Reads a model file. On failure reports one error message and returns false; warnings name
/// what was dropped or repaired. The model is filled only on success.
bool readModel(const std::string &path, const ImportOptions &options, ImportedModel &model,
               ImportStats &stats);

/// Gives the bytes of a side file of a model (materials, buffers, images outside the model) by
/// the name the model uses; false when there is none.
using SideFileReader = std::function<bool(const std::string &name, std::string &bytes)>;

/// Reads a model held in memory; name gives the format by its extension. Side files come from
/// sideFiles only, never from the disk; without it the model is read as if they were missing.
bool readModelFromMemory(const std::string &name, std::string_view bytes,
                         const ImportOptions &options, ImportedModel &model, ImportStats &stats,
                         const SideFileReader &sideFiles = {});

/// Makes names safe for scene files and file names: control characters, path separators and
/// bytes outside printable ASCII become '_'; an empty name becomes fallback.
std::string sanitizeName(const std::string &name, const std::string &fallback);

}  // namespace ox
