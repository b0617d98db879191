#pragma once

#include <cstdint>
#include <string>
#include <string_view>

/// Checks of what a model file declares against what it holds, made before the model library
/// sees the bytes, and the file layer every file of a model is read through.
namespace ox {

/// The largest model file, or side file of a model (materials, buffers, images), that is read.
constexpr uint64_t kMaxModelFileBytes = uint64_t(4) << 30;

/// Faces with more corners than this are dropped: triangulating one costs the square of its
/// corners.
constexpr uint32_t kMaxPolygonCorners = 1024;

/// Checks the counts and lengths a file of the given extension (lower case, with the dot)
/// declares: PLY element counts against the bytes their properties need, GLB chunk lengths
/// against the file. False with the reason in why when the file cannot hold what it claims.
bool checkDeclaredSizes(const std::string &extension, std::string_view bytes, std::string &why);

/// Reads a whole local file: regular files only (a named pipe or device is refused without
/// waiting), at most maxBytes actually read (files under /proc report the size 0). False with
/// the reason in why.
bool readModelFile(const std::string &path, uint64_t maxBytes, std::string &out, std::string &why);

}  // namespace ox
