#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "pointcloud/point_cloud.h"
#include "pointcloud/point_cloud_io.h"

/// Pieces shared by the point-cloud readers and writers (not part of the public interface).
namespace ox::pcdetail {

/// A variable definition as a file states it.
struct RawVariable {
    std::string name;
    uint32_t size = 0;   ///< element size in bytes
    uint32_t count = 0;  ///< element count
};

/// The header fields as a file states them.
struct RawHeader {
    PointCloudHeader fields;
    uint32_t numPoints = 0;
    uint32_t pointSize = 0;
    std::vector<RawVariable> variables;
};

/// The defaults a header starts from before its fields are read.
PointCloudHeader readDefaults();

/// Checks a header read from `name` (version, variable names and sizes, point size, expected
/// kind) and builds the variables; reports the messages and returns false when the samples
/// cannot be read.
bool checkHeader(const RawHeader &raw, const std::string &name, bool binary,
                 const PointSampleFactory *expected, std::vector<PointVariable> &variables);

/// Opens a regular file for reading (pipes and directories are refused); reports the failure.
/// Returns the descriptor or -1, and the size.
int openForReading(const std::string &path, uint64_t &size);

/// A name as the 32-byte fields store it: at most 31 bytes, cut on a character boundary.
std::string fieldName(const std::string &name);

}  // namespace ox::pcdetail
