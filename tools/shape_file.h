#pragma once

#include <string>

#include "tools/imported_model.h"

/// Writing imported shapes as temporary mesh files.
namespace ox {

/// Writes a shape as a temporary mesh file (version 2 when it has vertex colours, else 1),
/// replacing path atomically. Returns false with one error message on failure.
bool writeShapeFile(const std::string &path, const ImportedShape &shape);

}  // namespace ox
