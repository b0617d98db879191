#pragma once

#include <cstdint>
#include <cstdio>
#include <memory>
#include <string>
#include <vector>

#include "core/types.h"

/// Temporary mesh files ("vtm"): one binary file per shape, little-endian, no padding.
/// Layout: "VTM\0", u32 version (1 or 2), shape name, u32 V, u32 U, U UV-set names,
/// u32 G, G x (material name, u32 triangle count), 3 f32 box minimum, 3 f32 box maximum,
/// [version 2: u32 colour flag], V vertex records, then each group's triangles (3 u32 each).
/// A vertex record is position, normal, tangent, bitangent (12 f32), [colour (4 f32) when the
/// colour flag is set], then U UV pairs. Strings are their bytes and one 0 byte.
namespace vtm {

/// One material group of a mesh: the material name and how many triangles use it.
struct MaterialGroup {
    std::string name;
    uint32_t triangleCount = 0;

    bool operator==(const MaterialGroup &o) const = default;
};

/// Longest string a mesh file may hold (terminator excluded).
constexpr size_t kMaxStringLength = 4096;

/// Reader and writer of one temporary mesh file. The same class reads and writes, so the writer
/// emits exactly the layout the reader expects. Reading: made by the reader factory, which has
/// already read and checked the header. Writing: made by createWriter; the file appears under
/// its name only when commit() succeeds.
class VornTempMeshBase {
public:
    virtual ~VornTempMeshBase();

    /// File version (1 or 2).
    virtual uint32_t version() const = 0;
    /// Reads and checks the header after the magic and version (the factory calls it).
    virtual bool readHeader();
    /// Reads the fixed part of one vertex record: 12 floats, or 16 with colours.
    virtual bool readVertex(float *fixed);
    /// Reads one UV pair.
    virtual bool readUV(float *uv);
    /// Reads one triangle (three vertex indices).
    virtual bool readTriangle(uint32_t *indices);
    /// Writes magic, version and header from the header fields.
    virtual bool writeHeader();
    /// Writes the fixed part of one vertex record (12 floats, or 16 with colours).
    virtual bool writeVertex(const float *fixed);
    /// Writes one UV pair.
    virtual bool writeUV(const float *uv);
    /// Writes one triangle.
    virtual bool writeTriangle(const uint32_t *indices);
    /// True when every vertex record carries a colour.
    virtual bool hasVertexColors() const;
    /// Sets the colour flag (writing; ignored by version 1).
    virtual void setVertexColors(bool on);

    /// Header fields.
    const std::string &shapeName() const { return shapeName_; }
    void setShapeName(std::string n) { shapeName_ = std::move(n); }
    uint32_t vertexCount() const { return vertexCount_; }
    void setVertexCount(uint32_t v) { vertexCount_ = v; }
    const std::vector<std::string> &uvSetNames() const { return uvSetNames_; }
    void setUvSetNames(std::vector<std::string> n) { uvSetNames_ = std::move(n); }
    uint32_t uvSetCount() const { return static_cast<uint32_t>(uvSetNames_.size()); }
    const std::vector<MaterialGroup> &groups() const { return groups_; }
    void setGroups(std::vector<MaterialGroup> g) { groups_ = std::move(g); }
    const ox::BBox &bounds() const { return bounds_; }
    void setBounds(const ox::BBox &b) { bounds_ = b; }

    /// Total triangle count over all groups (64-bit: a file may claim more than 2^32).
    uint64_t triangleCount() const;
    /// Floats in the fixed part of a vertex record (12, or 16 with colours).
    uint32_t vertexFloats() const { return hasVertexColors() ? 16u : 12u; }
    /// True when the mesh has no vertex or no triangle: there is nothing to build.
    bool isEmpty() const { return vertexCount_ == 0 || triangleCount() == 0; }

    /// The file path.
    const std::string &path() const { return path_; }
    /// Why the last operation failed (empty when none did).
    const std::string &error() const { return error_; }

    /// Closes the file. A writer that was not committed removes its temporary file.
    void close();
    /// Writer only: flushes, closes and renames the temporary file to the path.
    bool commit();

protected:
    friend class TempMeshReaderFactory;
    friend std::unique_ptr<VornTempMeshBase> createWriter(const std::string &, uint32_t);

    VornTempMeshBase() = default;
    VornTempMeshBase(const VornTempMeshBase &) = delete;
    VornTempMeshBase &operator=(const VornTempMeshBase &) = delete;

    /// Takes over the open file (and the read position) of another object.
    void takeOver(VornTempMeshBase &other);
    /// Bytes read so far.
    uint64_t consumedBytes() const { return consumed_; }

    bool openRead(const std::string &path);
    bool openWrite(const std::string &path);
    bool readBytes(void *dst, size_t n);
    bool writeBytes(const void *src, size_t n);
    bool readU32(uint32_t &v);
    bool writeU32(uint32_t v);
    bool readString(std::string &s);
    bool writeString(const std::string &s);
    bool fail(std::string why);
    uint64_t bytesLeft() const;
    /// Checks the size the header implies against the file size (reading).
    bool checkBodySize(uint64_t headerEnd);

    std::string shapeName_;
    uint32_t vertexCount_ = 0;
    std::vector<std::string> uvSetNames_;
    std::vector<MaterialGroup> groups_;
    ox::BBox bounds_;

private:
    bool fillBuffer();
    bool flushBuffer();

    std::string path_;
    std::string tempPath_;
    std::string error_;
    FILE *file_ = nullptr;
    bool writing_ = false;
    uint64_t fileSize_ = 0;  // reading: size of the file
    uint64_t consumed_ = 0;  // reading: bytes handed out so far
    std::vector<unsigned char> buffer_;
    size_t bufPos_ = 0, bufEnd_ = 0;
};

/// Version 1: no vertex colours.
class VornTempMeshV1 : public VornTempMeshBase {
public:
    uint32_t version() const override { return 1; }
    bool hasVertexColors() const override { return false; }
    void setVertexColors(bool) override {}
};

/// Version 2: the version 1 header followed by a colour flag; colours in the vertex records.
class VornTempMeshV2 : public VornTempMeshBase {
public:
    uint32_t version() const override { return 2; }
    bool readHeader() override;
    bool writeHeader() override;
    bool hasVertexColors() const override { return colors_; }
    void setVertexColors(bool on) override { colors_ = on; }

private:
    bool colors_ = false;
};

/// Why an open for reading failed.
enum class OpenStatus { kOk, kCannotOpen, kBadMagic, kBadVersion, kBadHeader };

/// The process-wide temporary mesh reader factory (made on first use).
class TempMeshReaderFactory {
public:
    /// The one factory.
    static TempMeshReaderFactory &instance();
    /// Opens a file: checks the magic "VTM", makes the reader of its version and reads the
    /// header. Null when any of that fails (status and the reader's error say why).
    std::unique_ptr<VornTempMeshBase> open(const std::string &path, OpenStatus *status = nullptr,
                                           std::string *error = nullptr) const;
};

/// Makes a writer of version 1 or 2 for a path (null for another version or when the temporary
/// file cannot be created). Set the header fields, writeHeader, then the records, then commit.
std::unique_ptr<VornTempMeshBase> createWriter(const std::string &path, uint32_t version);

/// A whole mesh in file order, for tools and tests.
struct TempMesh {
    std::string name;
    std::vector<std::string> uvSetNames;
    std::vector<MaterialGroup> groups;
    ox::BBox bounds;
    bool colors = false;
    std::vector<float> vertices;    ///< 12 or 16 floats per vertex (colours after the frame)
    std::vector<float> uvs;         ///< uvSetNames.size() pairs per vertex
    std::vector<uint32_t> indices;  ///< 3 per triangle, groups in order

    uint32_t vertexCount() const {
        return static_cast<uint32_t>(vertices.size() / (colors ? 16 : 12));
    }
};

/// Writes a whole mesh (version 1 drops colours); the file appears only when complete.
bool writeTempMesh(const std::string &path, const TempMesh &mesh, uint32_t version,
                   std::string *error = nullptr);
/// Reads a whole mesh (header checks as the factory does; indices are not checked here).
bool readTempMesh(const std::string &path, TempMesh &mesh, std::string *error = nullptr);

}  // namespace vtm
