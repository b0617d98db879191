#pragma once

#include <string>
#include <string_view>

#include "pointcloud/point_cloud.h"

/// Reading and writing point-cloud files in their two encodings.
namespace ox {

/// The encodings of point-cloud files.
enum class PointCloudEncoding { Binary, Xml };

/// The encoding a path asks for: ".xml" (exactly, from the last ".") is XML, anything else
/// binary.
PointCloudEncoding pointCloudEncodingOf(std::string_view path);

/// Where a reader takes its bytes from: a file, or a memory block named for messages.
struct PointCloudSource {
    std::string name;         ///< the path, or the name used in messages
    std::string_view memory;  ///< the bytes, when fromMemory
    bool fromMemory = false;

    static PointCloudSource file(std::string path) { return {std::move(path), {}, false}; }
    static PointCloudSource inMemory(std::string_view bytes, std::string name = "(memory)") {
        return {std::move(name), bytes, true};
    }
};

/// Where a writer puts its bytes: a file (replaced atomically) or a string.
struct PointCloudTarget {
    std::string name;             ///< the path, or the name used in messages
    std::string *text = nullptr;  ///< the string, when writing to memory

    static PointCloudTarget file(std::string path) { return {std::move(path), nullptr}; }
    static PointCloudTarget inMemory(std::string &out) { return {"(memory)", &out}; }
};

/// A reader or writer of one encoding, applied to a whole cloud.
class PointCloudVisitor {
public:
    virtual ~PointCloudVisitor() = default;
    /// Reads into the cloud or writes it; false (with one error message) on failure. A failed
    /// read leaves the cloud as it was.
    virtual bool process(PointCloud &cloud) = 0;
};

/// Reads the binary encoding. With an expected kind, the file's variables must include that
/// kind's variables (found by name, with the same element size and count).
class PointCloudBinaryReader final : public PointCloudVisitor {
public:
    explicit PointCloudBinaryReader(PointCloudSource source,
                                    const PointSampleFactory *expected = nullptr)
        : source_(std::move(source)), expected_(expected) {}
    bool process(PointCloud &cloud) override;

private:
    PointCloudSource source_;
    const PointSampleFactory *expected_;
};

/// Writes the binary encoding.
class PointCloudBinaryWriter final : public PointCloudVisitor {
public:
    explicit PointCloudBinaryWriter(PointCloudTarget target) : target_(std::move(target)) {}
    bool process(PointCloud &cloud) override { return write(cloud); }
    /// The same for a cloud the caller cannot lend as mutable.
    bool write(const PointCloud &cloud);

private:
    PointCloudTarget target_;
};

/// Reads the XML encoding (no document type declarations, no entities, no network).
class PointCloudXMLReader final : public PointCloudVisitor {
public:
    explicit PointCloudXMLReader(PointCloudSource source,
                                 const PointSampleFactory *expected = nullptr)
        : source_(std::move(source)), expected_(expected) {}
    bool process(PointCloud &cloud) override;

private:
    PointCloudSource source_;
    const PointSampleFactory *expected_;
};

/// Writes the XML encoding ("ISO-8859-1"); floats carry 9 significant digits, so every finite
/// value reads back bit for bit.
class PointCloudXMLWriter final : public PointCloudVisitor {
public:
    explicit PointCloudXMLWriter(PointCloudTarget target) : target_(std::move(target)) {}
    bool process(PointCloud &cloud) override { return write(cloud); }
    /// The same for a cloud the caller cannot lend as mutable.
    bool write(const PointCloud &cloud);

private:
    PointCloudTarget target_;
};

/// Reads a file in the encoding its name chooses. False (with messages) on failure; the cloud
/// is then unchanged.
bool readPointCloud(const std::string &path, PointCloud &cloud,
                    const PointSampleFactory *expected = nullptr);
/// Writes a file in the encoding its name chooses, through a temporary name in the same
/// directory: a failure leaves no partial file and any earlier file intact.
bool writePointCloud(const std::string &path, const PointCloud &cloud);

/// Reads a memory block of the given encoding.
bool readPointCloudFromMemory(std::string_view bytes, PointCloudEncoding encoding,
                              PointCloud &cloud, const PointSampleFactory *expected = nullptr);
/// Writes a cloud into a string in the given encoding.
bool writePointCloudToMemory(std::string &out, PointCloudEncoding encoding,
                             const PointCloud &cloud);

}  // namespace ox
