#pragma once

#include <string>

#include "tools/imported_model.h"

/// Writes the scene file (root "OXScene") of an imported model.
namespace ox {

/// Writes materials, instances, cameras and lights of the model as one scene document to path
/// (replaced atomically). Every member is written, defaults included. Returns false with one
/// error message when the file cannot be written.
bool writeSceneXml(const std::string &path, const ImportedModel &model);

}  // namespace ox
