#pragma once

#include <cstdint>
#include <cstring>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "core/types.h"

/// Point clouds: a header that describes the sample kind and the layout of one sample as a list
/// of named variables, and the samples themselves, stored exactly as the binary encoding lays
/// them out (one record of pointSize bytes per sample, little-endian).
namespace ox {

/// Sample kinds; the value is the type identifier stored in files.
enum class PointKind : uint32_t {
    Point = 0,
    MotionVector = 1,
    Irradiance = 2,
    Occlusion = 3,
    Photon = 4,
    Sss = 5,
    Dough = 6,
    FloatArray = 7,
    RgbArray = 8,
    PathTracer = 9,
    Radiance = 10,
};
/// Number of sample kinds.
constexpr uint32_t kPointKindCount = 11;

/// The type name of a kind ("point", "irradiancePoint", ...); also the XML element of a sample.
const char *pointKindName(PointKind kind);
/// The kind of a type identifier, if it is one.
std::optional<PointKind> pointKindFromId(uint32_t typeId);

/// Data types of variable elements; files store only the element size.
enum class PointDataType : uint8_t {
    Int8 = 0,
    UInt8 = 1,
    Int16 = 2,
    Int32 = 3,
    UInt32 = 4,
    Float = 5,
    Color32 = 6,  ///< four 8-bit channels packed in one word
    Flags32 = 7,  ///< a word of bit flags
    Double = 8,
};

/// Bytes of one element of a data type.
uint32_t pointDataTypeSize(PointDataType type);
/// The type assumed for an element size when a variable's name says nothing more; false for a
/// size no data type has.
bool pointDataTypeForSize(uint32_t size, PointDataType &type);

/// The name of a data type ("float", "int32", ...).
const char *pointDataTypeName(PointDataType type);
/// Appends the text of one element (at `element`, little-endian) as the XML encoding writes it:
/// integers in decimal, floats with 9 and doubles with 17 significant digits.
void appendPointValueText(const uint8_t *element, PointDataType type, std::string &out);

/// Version written into new files.
constexpr uint32_t kPointCloudVersion = 1;
/// Bytes of the fixed text fields; a name keeps at most one byte less (the terminator).
constexpr uint32_t kPointCloudNameBytes = 32;

/// One variable of a sample: a name, an element type and an element count.
struct PointVariable {
    std::string name;
    PointDataType type = PointDataType::Float;
    uint32_t count = 1;
    uint32_t offset = 0;  ///< bytes from the start of a sample (set by the cloud)

    uint32_t elementSize() const { return pointDataTypeSize(type); }
    uint64_t bytes() const { return uint64_t(elementSize()) * count; }
};

/// The header fields other than the counts and the variables.
struct PointCloudHeader {
    uint32_t version = kPointCloudVersion;  ///< as read; writers always write the current one
    std::string description;
    std::string type = "point";  ///< type name
    uint32_t typeId = 0;
    uint32_t compression = 0;  ///< stored and written back, not interpreted
    Vec3 boundsMin{3.4028235e38f, 3.4028235e38f, 3.4028235e38f};
    Vec3 boundsMax{-3.4028235e38f, -3.4028235e38f, -3.4028235e38f};
    Mtx4 objectToWorld;

    bool operator==(const PointCloudHeader &o) const = default;
};

/// Allocator that leaves new bytes uninitialised: the buffer is about to be overwritten by a
/// read or by the caller.
template <typename T>
struct UninitialisedAllocator : std::allocator<T> {
    template <typename U>
    struct rebind {
        using other = UninitialisedAllocator<U>;
    };
    UninitialisedAllocator() = default;
    template <typename U>
    UninitialisedAllocator(const UninitialisedAllocator<U> &) {}
    template <typename U>
    void construct(U *p) {
        ::new (static_cast<void *>(p)) U;
    }
    template <typename U, typename... Args>
    void construct(U *p, Args &&...args) {
        ::new (static_cast<void *>(p)) U(std::forward<Args>(args)...);
    }
};

/// The sample bytes of a cloud.
using PointBytes = std::vector<uint8_t, UninitialisedAllocator<uint8_t>>;

/// A point cloud: header, sample layout and samples.
class PointCloud {
public:
    PointCloud() = default;

    PointCloudHeader &header() { return header_; }
    const PointCloudHeader &header() const { return header_; }

    /// The variables in sample order.
    const std::vector<PointVariable> &variables() const { return variables_; }
    /// Appends a variable to the layout; only while the cloud holds no samples.
    void addVariable(std::string name, PointDataType type, uint32_t count);
    /// Replaces the layout (offsets are recomputed); only while the cloud holds no samples.
    void setVariables(std::vector<PointVariable> variables);
    /// The variable of that name, or nullptr.
    const PointVariable *findVariable(std::string_view name) const;
    /// Bytes of one sample.
    uint64_t pointSize() const { return pointSize_; }

    /// Number of samples.
    uint64_t size() const { return pointSize_ ? bytes_.size() / pointSize_ : 0; }
    /// Sets the number of samples; new samples are zero. False when memory runs out. A layout
    /// without bytes holds no samples.
    bool resize(uint64_t count);
    /// Removes every sample (the layout stays).
    void clear();
    /// Appends one zero sample and returns its bytes (nullptr when memory runs out).
    uint8_t *appendPoint();

    /// The bytes of sample i.
    uint8_t *point(uint64_t i) { return bytes_.data() + i * pointSize_; }
    const uint8_t *point(uint64_t i) const { return bytes_.data() + i * pointSize_; }
    /// All sample bytes.
    const PointBytes &bytes() const { return bytes_; }
    /// The sample buffer, for readers that fill it in one piece.
    PointBytes &mutableBytes() { return bytes_; }

    /// Element e of a variable of sample i read as a float (any numeric type converts).
    float getFloat(uint64_t i, const PointVariable &v, uint32_t e = 0) const;
    /// Stores a float into element e (converted to the variable's type).
    void setFloat(uint64_t i, const PointVariable &v, uint32_t e, float value);
    /// Three elements of a variable as a vector.
    Vec3 getVec3(uint64_t i, const PointVariable &v) const {
        return {getFloat(i, v, 0), getFloat(i, v, 1), getFloat(i, v, 2)};
    }
    void setVec3(uint64_t i, const PointVariable &v, const Vec3 &p) {
        setFloat(i, v, 0, p.x), setFloat(i, v, 1, p.y), setFloat(i, v, 2, p.z);
    }
    /// Element e of an integer variable.
    int64_t getInt(uint64_t i, const PointVariable &v, uint32_t e = 0) const;
    void setInt(uint64_t i, const PointVariable &v, uint32_t e, int64_t value);

    /// Sets the header's box to the box of the "position" variable (unchanged without one).
    void updateBounds();

    /// Same header, layout and sample bytes.
    bool operator==(const PointCloud &o) const;

private:
    PointCloudHeader header_;
    std::vector<PointVariable> variables_;
    uint64_t pointSize_ = 0;
    PointBytes bytes_;
};

/// The name under which a variable appears in the XML encoding ("rvalues" is "redValues");
/// names it does not know stand as they are.
std::string_view pointVariableXmlName(std::string_view name);
/// The data type of a variable known by name when its element size agrees, else the type of
/// the size alone (see pointDataTypeForSize).
bool pointVariableType(std::string_view name, uint32_t elementSize, PointDataType &type);

/// Describes one sample kind: its type identifier, type name and variables, and makes clouds
/// of that kind. The base class describes "point" samples (a position).
class PointSampleFactory {
public:
    /// A variable of the kind's layout.
    struct Variable {
        const char *name;
        PointDataType type;
        uint32_t count;
    };

    PointSampleFactory() : PointSampleFactory(PointKind::Point) {}
    /// The standard layout of a kind (array kinds with one value per channel).
    explicit PointSampleFactory(PointKind kind, uint32_t arrayValues = 1);

    PointKind kind() const { return kind_; }
    uint32_t typeId() const { return uint32_t(kind_); }
    const char *typeName() const { return pointKindName(kind_); }
    const std::vector<Variable> &variables() const { return variables_; }
    /// Bytes of one sample.
    uint64_t pointSize() const;

    /// An empty cloud of this kind.
    PointCloud create() const;
    /// True when the cloud holds every variable of this kind with the same element size and
    /// count (where they sit in a sample does not matter); otherwise `missing` names the first
    /// one that does not fit.
    bool fits(const PointCloud &cloud, std::string &missing) const;

private:
    PointKind kind_;
    std::vector<Variable> variables_;
};

/// Radiance cache samples.
class RadianceSampleFactory : public PointSampleFactory {
public:
    RadianceSampleFactory() : PointSampleFactory(PointKind::Radiance) {}
};
/// Irradiance cache samples.
class IrradianceSampleFactory : public PointSampleFactory {
public:
    IrradianceSampleFactory() : PointSampleFactory(PointKind::Irradiance) {}
};
/// Photon samples.
class PhotonPointSampleFactory : public PointSampleFactory {
public:
    PhotonPointSampleFactory() : PointSampleFactory(PointKind::Photon) {}
};
/// Dough (indexed surface) samples.
class DoughPointSampleFactory : public PointSampleFactory {
public:
    DoughPointSampleFactory() : PointSampleFactory(PointKind::Dough) {}
};
/// Indexed samples with `values` floats each.
class FloatArrayPointSampleFactory : public PointSampleFactory {
public:
    explicit FloatArrayPointSampleFactory(uint32_t values)
        : PointSampleFactory(PointKind::FloatArray, values) {}
};
/// Indexed samples with `values` red, green and blue floats each.
class RGBArrayPointSampleFactory : public PointSampleFactory {
public:
    explicit RGBArrayPointSampleFactory(uint32_t values)
        : PointSampleFactory(PointKind::RgbArray, values) {}
};
/// Path-tracer cache samples.
class PathTracerSampleFactory : public PointSampleFactory {
public:
    PathTracerSampleFactory() : PointSampleFactory(PointKind::PathTracer) {}
};

}  // namespace ox
