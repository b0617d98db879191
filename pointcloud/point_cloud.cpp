#include "pointcloud/point_cloud.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <new>

#include "core/check.h"

static_assert(std::endian::native == std::endian::little,
              "sample bytes are kept in file order, which is little-endian");

namespace ox {

namespace {

constexpr const char *kKindNames[kPointKindCount] = {
    "point",         "motionVectorPoint", "irradiancePoint", "occlusionPoint",
    "photonPoint",   "sssPoint",          "doughPoint",      "floatArrayPoint",
    "rgbArrayPoint", "pathTracerPoint",   "radiancePoint",
};

constexpr uint32_t kTypeSizes[] = {1, 1, 2, 4, 4, 4, 4, 4, 8};

/// Variables known by name: their XML element and data type.
struct KnownVariable {
    const char *name;
    const char *xmlName;
    PointDataType type;
};

constexpr KnownVariable kKnownVariables[] = {
    {"position", "position", PointDataType::Float},
    {"normal", "normal", PointDataType::Float},
    {"facenormal", "faceNormal", PointDataType::Float},
    {"radius", "radius", PointDataType::Float},
    {"ugrad", "uGrad", PointDataType::Float},
    {"vgrad", "vGrad", PointDataType::Float},
    {"rvalues", "redValues", PointDataType::Float},
    {"gvalues", "greenValues", PointDataType::Float},
    {"bvalues", "blueValues", PointDataType::Float},
    {"ugradvalues", "uGradValues", PointDataType::Float},
    {"vgradvalues", "vGradValues", PointDataType::Float},
    {"occlusion", "occlusion", PointDataType::Float},
    {"incident", "incident", PointDataType::Float},
    {"flux", "flux", PointDataType::Float},
    {"vector", "vector", PointDataType::Float},
    {"index", "index", PointDataType::Int32},
    {"size", "size", PointDataType::Int32},
    {"values", "values", PointDataType::Float},
    {"value", "value", PointDataType::Float},
    {"rgrad", "rGrad", PointDataType::Float},
    {"tgrad", "tGrad", PointDataType::Float},
    {"time", "time", PointDataType::Float},
    {"animdist", "animdist", PointDataType::Float},
    {"coefficients", "coefficients", PointDataType::Float},
    {"weight", "weight", PointDataType::Float},
    {"flags", "flags", PointDataType::Flags32},
    {"bentnormal", "bentNormal", PointDataType::Float},
    {"area", "area", PointDataType::Float},
    {"irradiance", "irradiance", PointDataType::Float},
    {"radiance", "radiance", PointDataType::Float},
    {"numsamples", "numSamples", PointDataType::UInt32},
};

const KnownVariable *knownVariable(std::string_view name) {
    for (const KnownVariable &k : kKnownVariables)
        if (name == k.name) return &k;
    return nullptr;
}

using V = PointSampleFactory::Variable;
constexpr PointDataType F = PointDataType::Float;

std::vector<V> layoutOf(PointKind kind, uint32_t n) {
    switch (kind) {
        case PointKind::Point:
            return {{"position", F, 3}};
        case PointKind::MotionVector:
            return {{"position", F, 3}, {"vector", F, 3}};
        case PointKind::Irradiance:
            return {{"position", F, 3},  {"normal", F, 3}, {"value", F, 3},
                    {"radius", F, 1},    {"time", F, 1},   {"animdist", F, 1},
                    {"rgrad", F, 3},     {"tgrad", F, 3},  {"coefficients", F, 8},
                    {"occlusion", F, 1}, {"weight", F, 1}, {"flags", PointDataType::Flags32, 1}};
        case PointKind::Occlusion:
            return {{"position", F, 3},
                    {"normal", F, 3},
                    {"radius", F, 1},
                    {"occlusion", F, 1},
                    {"bentnormal", F, 3}};
        case PointKind::Photon:
            return {{"position", F, 3}, {"normal", F, 3}, {"incident", F, 3}, {"flux", F, 3}};
        case PointKind::Sss:
            return {{"position", F, 3}, {"normal", F, 3}, {"area", F, 1}, {"irradiance", F, 3}};
        case PointKind::Dough:
            return {{"position", F, 3}, {"index", PointDataType::Int32, 1}, {"normal", F, 3}};
        case PointKind::FloatArray:
            return {{"position", F, 3},
                    {"index", PointDataType::Int32, 1},
                    {"normal", F, 3},
                    {"values", F, n}};
        case PointKind::RgbArray:
            return {{"position", F, 3}, {"index", PointDataType::Int32, 1},
                    {"normal", F, 3},   {"rvalues", F, n},
                    {"gvalues", F, n},  {"bvalues", F, n}};
        case PointKind::PathTracer:
            return {{"position", F, 3},
                    {"normal", F, 3},
                    {"irradiance", F, 3},
                    {"radiance", F, 3},
                    {"radius", F, 1},
                    {"area", F, 1},
                    {"numsamples", PointDataType::UInt32, 1},
                    {"index", PointDataType::Int32, 1},
                    {"flags", PointDataType::Flags32, 1}};
        case PointKind::Radiance:
            return {{"position", F, 3},    {"normal", F, 3},      {"facenormal", F, 3},
                    {"radius", F, 1},      {"ugrad", F, 3},       {"vgrad", F, 3},
                    {"rvalues", F, 9},     {"gvalues", F, 9},     {"bvalues", F, 9},
                    {"ugradvalues", F, 9}, {"vgradvalues", F, 9}, {"occlusion", F, 1}};
    }
    return {};
}

}  // namespace

const char *pointKindName(PointKind kind) {
    uint32_t id = uint32_t(kind);
    return id < kPointKindCount ? kKindNames[id] : "unknown";
}

std::optional<PointKind> pointKindFromId(uint32_t typeId) {
    if (typeId >= kPointKindCount) return std::nullopt;
    return PointKind(typeId);
}

uint32_t pointDataTypeSize(PointDataType type) {
    uint32_t code = uint32_t(type);
    OX_CHECK(code < std::size(kTypeSizes));
    return kTypeSizes[code];
}

const char *pointDataTypeName(PointDataType type) {
    static const char *const kNames[] = {"int8",  "uint8",   "int16",   "int32", "uint32",
                                         "float", "color32", "flags32", "double"};
    uint32_t code = uint32_t(type);
    OX_CHECK(code < std::size(kNames));
    return kNames[code];
}

bool pointDataTypeForSize(uint32_t size, PointDataType &type) {
    switch (size) {
        case 1:
            type = PointDataType::UInt8;
            return true;
        case 2:
            type = PointDataType::Int16;
            return true;
        case 4:
            type = PointDataType::Float;
            return true;
        case 8:
            type = PointDataType::Double;
            return true;
        default:
            return false;
    }
}

std::string_view pointVariableXmlName(std::string_view name) {
    const KnownVariable *k = knownVariable(name);
    return k ? std::string_view(k->xmlName) : name;
}

bool pointVariableType(std::string_view name, uint32_t elementSize, PointDataType &type) {
    const KnownVariable *k = knownVariable(name);
    if (k && pointDataTypeSize(k->type) == elementSize) {
        type = k->type;
        return true;
    }
    return pointDataTypeForSize(elementSize, type);
}

// ---- PointCloud --------------------------------------------------------------------------------

void PointCloud::addVariable(std::string name, PointDataType type, uint32_t count) {
    OX_CHECK(bytes_.empty());
    PointVariable v;
    v.name = std::move(name);
    v.type = type;
    v.count = count;
    v.offset = uint32_t(pointSize_);
    pointSize_ += v.bytes();
    OX_CHECK(pointSize_ <= UINT32_MAX);
    variables_.push_back(std::move(v));
}

void PointCloud::setVariables(std::vector<PointVariable> variables) {
    OX_CHECK(bytes_.empty());
    uint64_t offset = 0;
    for (PointVariable &v : variables) {
        v.offset = uint32_t(offset);
        offset += v.bytes();
        OX_CHECK(offset <= UINT32_MAX);
    }
    variables_ = std::move(variables);
    pointSize_ = offset;
}

const PointVariable *PointCloud::findVariable(std::string_view name) const {
    for (const PointVariable &v : variables_)
        if (v.name == name) return &v;
    return nullptr;
}

bool PointCloud::resize(uint64_t count) {
    OX_CHECK(pointSize_ > 0 || count == 0);
    const uint64_t old = bytes_.size();
    const uint64_t want = count * pointSize_;
    if (pointSize_ && want / pointSize_ != count) return false;
    try {
        bytes_.resize(size_t(want));
    } catch (const std::exception &) {
        return false;
    }
    if (want > old) std::memset(bytes_.data() + old, 0, size_t(want - old));
    return true;
}

void PointCloud::clear() { bytes_.clear(); }

uint8_t *PointCloud::appendPoint() {
    OX_CHECK(pointSize_ > 0);
    const uint64_t n = size();
    if (!resize(n + 1)) return nullptr;
    return point(n);
}

namespace {

template <typename T>
T load(const uint8_t *p) {
    T v;
    std::memcpy(&v, p, sizeof v);
    return v;
}

template <typename T>
void store(uint8_t *p, T v) {
    std::memcpy(p, &v, sizeof v);
}

}  // namespace

float PointCloud::getFloat(uint64_t i, const PointVariable &v, uint32_t e) const {
    OX_CHECK(e < v.count);
    const uint8_t *p = point(i) + v.offset + uint64_t(e) * v.elementSize();
    switch (v.type) {
        case PointDataType::Int8:
            return float(load<int8_t>(p));
        case PointDataType::UInt8:
            return float(load<uint8_t>(p));
        case PointDataType::Int16:
            return float(load<int16_t>(p));
        case PointDataType::Int32:
            return float(load<int32_t>(p));
        case PointDataType::UInt32:
        case PointDataType::Color32:
        case PointDataType::Flags32:
            return float(load<uint32_t>(p));
        case PointDataType::Float:
            return load<float>(p);
        case PointDataType::Double:
            return float(load<double>(p));
    }
    return 0.0f;
}

void PointCloud::setFloat(uint64_t i, const PointVariable &v, uint32_t e, float value) {
    OX_CHECK(e < v.count);
    uint8_t *p = point(i) + v.offset + uint64_t(e) * v.elementSize();
    switch (v.type) {
        case PointDataType::Float:
            return store(p, value);
        case PointDataType::Double:
            return store(p, double(value));
        default:
            return setInt(i, v, e, std::isfinite(value) ? int64_t(value) : 0);
    }
}

int64_t PointCloud::getInt(uint64_t i, const PointVariable &v, uint32_t e) const {
    OX_CHECK(e < v.count);
    const uint8_t *p = point(i) + v.offset + uint64_t(e) * v.elementSize();
    switch (v.type) {
        case PointDataType::Int8:
            return load<int8_t>(p);
        case PointDataType::UInt8:
            return load<uint8_t>(p);
        case PointDataType::Int16:
            return load<int16_t>(p);
        case PointDataType::Int32:
            return load<int32_t>(p);
        case PointDataType::UInt32:
        case PointDataType::Color32:
        case PointDataType::Flags32:
            return load<uint32_t>(p);
        case PointDataType::Float:
        case PointDataType::Double: {
            double d = v.type == PointDataType::Float ? double(load<float>(p)) : load<double>(p);
            return std::isfinite(d) ? int64_t(std::clamp(d, -9.2e18, 9.2e18)) : 0;
        }
    }
    return 0;
}

void PointCloud::setInt(uint64_t i, const PointVariable &v, uint32_t e, int64_t value) {
    OX_CHECK(e < v.count);
    uint8_t *p = point(i) + v.offset + uint64_t(e) * v.elementSize();
    switch (v.type) {
        case PointDataType::Int8:
        case PointDataType::UInt8:
            return store(p, uint8_t(value));
        case PointDataType::Int16:
            return store(p, uint16_t(value));
        case PointDataType::Int32:
        case PointDataType::UInt32:
        case PointDataType::Color32:
        case PointDataType::Flags32:
            return store(p, uint32_t(value));
        case PointDataType::Float:
            return store(p, float(value));
        case PointDataType::Double:
            return store(p, double(value));
    }
}

void PointCloud::updateBounds() {
    const PointVariable *pos = findVariable("position");
    if (!pos || pos->count < 3) return;
    BBox box;
    for (uint64_t i = 0, n = size(); i < n; ++i) box.extend(getVec3(i, *pos));
    header_.boundsMin = box.min;
    header_.boundsMax = box.max;
}

bool PointCloud::operator==(const PointCloud &o) const {
    if (!(header_ == o.header_) || pointSize_ != o.pointSize_ ||
        variables_.size() != o.variables_.size())
        return false;
    for (size_t k = 0; k < variables_.size(); ++k) {
        const PointVariable &a = variables_[k], &b = o.variables_[k];
        if (a.name != b.name || a.type != b.type || a.count != b.count) return false;
    }
    return bytes_.size() == o.bytes_.size() &&
           (bytes_.empty() || std::memcmp(bytes_.data(), o.bytes_.data(), bytes_.size()) == 0);
}

// ---- factories ---------------------------------------------------------------------------------

PointSampleFactory::PointSampleFactory(PointKind kind, uint32_t arrayValues)
    : kind_(kind), variables_(layoutOf(kind, arrayValues)) {}

uint64_t PointSampleFactory::pointSize() const {
    uint64_t size = 0;
    for (const Variable &v : variables_) size += uint64_t(pointDataTypeSize(v.type)) * v.count;
    return size;
}

PointCloud PointSampleFactory::create() const {
    PointCloud cloud;
    cloud.header().type = typeName();
    cloud.header().typeId = typeId();
    for (const Variable &v : variables_) cloud.addVariable(v.name, v.type, v.count);
    return cloud;
}

bool PointSampleFactory::fits(const PointCloud &cloud, std::string &missing) const {
    for (const Variable &v : variables_) {
        const PointVariable *have = cloud.findVariable(v.name);
        if (!have || have->elementSize() != pointDataTypeSize(v.type) || have->count != v.count) {
            missing = v.name;
            return false;
        }
    }
    return true;
}

}  // namespace ox
