#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cmath>
#include <cstring>
#include <limits>
#include <new>

#include "config/xml_stream.h"
#include "core/message.h"
#include "pointcloud/point_cloud_internal.h"
#include "pointcloud/point_cloud_io.h"

namespace ox {

using pcdetail::RawHeader;
using pcdetail::RawVariable;

namespace {

/// The child elements of a variable with several elements: x, y, z for three, else "element".
const char *componentName(const PointVariable &v, uint32_t e) {
    static const char *const kXyz[] = {"x", "y", "z"};
    return v.count == 3 ? kXyz[e] : "element";
}

/// The text of element e of a sample variable.
std::string_view valueText(const uint8_t *p, PointDataType type, char (&buf)[40]) {
    std::to_chars_result r{};
    char *end = buf + sizeof buf;
    switch (type) {
        case PointDataType::Int8:
            r = std::to_chars(buf, end, int(int8_t(*p)));
            break;
        case PointDataType::UInt8:
            r = std::to_chars(buf, end, unsigned(*p));
            break;
        case PointDataType::Int16: {
            int16_t v;
            std::memcpy(&v, p, 2);
            r = std::to_chars(buf, end, int(v));
            break;
        }
        case PointDataType::Int32: {
            int32_t v;
            std::memcpy(&v, p, 4);
            r = std::to_chars(buf, end, v);
            break;
        }
        case PointDataType::UInt32:
        case PointDataType::Color32:
        case PointDataType::Flags32: {
            uint32_t v;
            std::memcpy(&v, p, 4);
            r = std::to_chars(buf, end, v);
            break;
        }
        case PointDataType::Float: {
            float v;
            std::memcpy(&v, p, 4);
            r = std::to_chars(buf, end, v, std::chars_format::general, 9);
            break;
        }
        case PointDataType::Double: {
            double v;
            std::memcpy(&v, p, 8);
            r = std::to_chars(buf, end, v, std::chars_format::general, 17);
            break;
        }
    }
    return std::string_view(buf, size_t(r.ptr - buf));
}

std::string_view trimSpace(std::string_view s) {
    auto space = [](char c) { return c == ' ' || c == '\t' || c == '\n' || c == '\r'; };
    while (!s.empty() && space(s.front())) s.remove_prefix(1);
    while (!s.empty() && space(s.back())) s.remove_suffix(1);
    return s;
}

/// Reads one element of `type` from text into p; false for anything but one whole number
/// within the type's range.
bool parseValue(std::string_view text, PointDataType type, uint8_t *p) {
    text = trimSpace(text);
    if (text.empty()) return false;
    const char *b = text.data(), *e = text.data() + text.size();
    if (*b == '+') ++b;  // written by hand now and then
    if (type == PointDataType::Float || type == PointDataType::Double) {
        double d = 0;
        float f = 0;
        auto r = type == PointDataType::Float ? std::from_chars(b, e, f) : std::from_chars(b, e, d);
        // Out-of-range values read as infinity or zero would not be what the file says.
        if (r.ec != std::errc() || r.ptr != e) return false;
        if (type == PointDataType::Float)
            std::memcpy(p, &f, 4);
        else
            std::memcpy(p, &d, 8);
        return true;
    }
    int64_t v = 0;
    auto r = std::from_chars(b, e, v);
    if (r.ec != std::errc() || r.ptr != e) return false;
    int64_t lo = 0, hi = 0;
    switch (type) {
        case PointDataType::Int8:
            lo = INT8_MIN, hi = INT8_MAX;
            break;
        case PointDataType::UInt8:
            lo = 0, hi = UINT8_MAX;
            break;
        case PointDataType::Int16:
            lo = INT16_MIN, hi = INT16_MAX;
            break;
        case PointDataType::Int32:
            lo = INT32_MIN, hi = INT32_MAX;
            break;
        default:
            lo = 0, hi = UINT32_MAX;
            break;
    }
    if (v < lo || v > hi) return false;
    const uint32_t size = pointDataTypeSize(type);
    const uint64_t bits = uint64_t(v);
    std::memcpy(p, &bits, size);  // little-endian: the low bytes come first
    return true;
}

bool parseU32(std::string_view text, uint32_t &out) {
    uint8_t b[4];
    if (!parseValue(text, PointDataType::UInt32, b)) return false;
    std::memcpy(&out, b, 4);
    return true;
}

bool parseF32(std::string_view text, float &out) {
    uint8_t b[4];
    if (!parseValue(text, PointDataType::Float, b)) return false;
    std::memcpy(&out, b, 4);
    return true;
}

// ---- reading -----------------------------------------------------------------------------------

/// Longest text of one value or name; longer texts are not values of this format.
constexpr size_t kMaxText = 4096;

class PointCloudXmlHandler final : public XmlStreamHandler {
public:
    PointCloudXmlHandler(const std::string &name, const PointSampleFactory *expected,
                         uint64_t documentBytes)
        : name_(name), expected_(expected), documentBytes_(documentBytes) {
        raw_.fields = pcdetail::readDefaults();
    }

    bool startElement(std::string_view name) override;
    bool characters(std::string_view text) override {
        if (stack_.empty() || !stack_.back().text) return true;
        if (text_.size() + text.size() > kMaxText) return fail("a value is too long");
        text_.append(text);
        return true;
    }
    bool endElement() override;

    /// After a successful parse: checks the end state and hands over the cloud.
    bool finish(PointCloud &cloud);
    /// True when the handler reported its own error.
    bool reported() const { return reported_; }

private:
    enum Kind : uint8_t {
        Root,
        Header,
        Field,   // a header field with text; index = the field
        Corner,  // index 0 min, 1 max
        CornerPart,
        Matrix,
        Row,
        Cell,
        Definition,
        DefinitionField,
        Body,
        Sample,
        Variable,  // index = variable
        Element,
    };
    enum FieldId : uint8_t {
        FVersion,
        FDescription,
        FType,
        FTypeId,
        FCompression,
        FNumPoints,
        FPointSize,
        FNumVariables,
        FVariableName,
        FDataTypeSize,
        FDataTypeCount,
        FCount
    };
    struct Frame {
        Kind kind;
        uint32_t index = 0;
        uint32_t children = 0;
        bool text = false;
    };

    bool push(Kind kind, uint32_t index, bool text) {
        stack_.push_back({kind, index, 0, text});
        text_.clear();
        return true;
    }
    bool fail(const std::string &why) {
        message(kMsgError, 1, "Could not read point cloud file %s: %s", name_.c_str(), why.c_str());
        reported_ = true;
        return false;
    }
    bool unexpected(std::string_view name) {
        return fail("unexpected element <" + std::string(name) + ">");
    }
    bool headerFailed() {
        message(kMsgError, 1, "Could not read header in file %s!", name_.c_str());
        reported_ = true;
        return false;
    }
    bool startBody();
    bool storeField(uint32_t field, std::string_view text);

    const std::string &name_;
    const PointSampleFactory *expected_;
    uint64_t documentBytes_;
    std::vector<Frame> stack_;
    std::string text_;
    bool reported_ = false;

    RawHeader raw_;
    bool seenField_[FCount] = {};
    bool seenHeader_ = false, seenBody_ = false;
    uint32_t definitionFields_ = 0;
    uint32_t numVariablesStated_ = 0;
    PointCloud cloud_;
    std::vector<std::string> xmlNames_;
    std::vector<uint8_t> seenVariable_;
    uint8_t *sample_ = nullptr;
};

bool PointCloudXmlHandler::startElement(std::string_view name) {
    if (stack_.empty()) {
        if (name != "pointCloud")
            return fail("the root element is <" + std::string(name) + ">, not <pointCloud>");
        return push(Root, 0, false);
    }
    Frame &top = stack_.back();
    switch (top.kind) {
        case Root:
            if (name == "header" && !seenHeader_ && !seenBody_) {
                seenHeader_ = true;
                return push(Header, 0, false);
            }
            if (name == "body" && seenHeader_ && !seenBody_) {
                seenBody_ = true;
                return startBody() && push(Body, 0, false);
            }
            return unexpected(name);
        case Header: {
            static const char *const kFields[] = {"version",   "description", "type",
                                                  "typeId",    "compression", "numPoints",
                                                  "pointSize", "numVariables"};
            for (uint32_t f = 0; f < std::size(kFields); ++f)
                if (name == kFields[f]) {
                    if (seenField_[f]) return fail("<" + std::string(name) + "> appears twice");
                    seenField_[f] = true;
                    return push(Field, f, true);
                }
            if (name == "boundingBoxMinCorner") return push(Corner, 0, false);
            if (name == "boundingBoxMaxCorner") return push(Corner, 1, false);
            if (name == "objectToWorldMatrix") return push(Matrix, 0, false);
            if (name == "variableDefinition") {
                // Each definition needs dozens of bytes: the count is bounded by the document.
                if (raw_.variables.size() >= documentBytes_ / 16 + 1) return unexpected(name);
                raw_.variables.emplace_back();
                definitionFields_ = 0;
                return push(Definition, 0, false);
            }
            return unexpected(name);
        }
        case Corner:
            if (top.children < 3 && name.size() == 1 && name[0] == "xyz"[top.children])
                return push(CornerPart, top.index * 3 + top.children++, true);
            return unexpected(name);
        case Matrix:
            if (name == "r" && top.children < 4) return push(Row, top.children++, false);
            return unexpected(name);
        case Row:
            if (name == "c" && top.children < 4)
                return push(Cell, top.index * 4 + top.children++, true);
            return unexpected(name);
        case Definition: {
            static const char *const kFields[] = {"variableName", "dataTypeSize", "dataTypeCount"};
            for (uint32_t f = 0; f < 3; ++f)
                if (name == kFields[f]) {
                    if (definitionFields_ & (1u << f))
                        return fail("<" + std::string(name) + "> appears twice");
                    definitionFields_ |= 1u << f;
                    return push(DefinitionField, FVariableName + f, true);
                }
            return unexpected(name);
        }
        case Body: {
            const std::string &type = cloud_.header().type;
            if (name != type && name != "sample") return unexpected(name);
            if (cloud_.size() >= raw_.numPoints)
                return fail(formatText("more samples than the header's %u", raw_.numPoints));
            sample_ = cloud_.appendPoint();
            if (!sample_) return fail("out of memory");
            std::fill(seenVariable_.begin(), seenVariable_.end(), 0);
            return push(Sample, 0, false);
        }
        case Sample:
            for (uint32_t k = 0; k < xmlNames_.size(); ++k)
                if (name == xmlNames_[k]) {
                    if (seenVariable_[k])
                        return fail("<" + std::string(name) + "> appears twice in a sample");
                    seenVariable_[k] = 1;
                    return push(Variable, k, cloud_.variables()[k].count == 1);
                }
            return unexpected(name);
        case Variable: {
            const PointVariable &v = cloud_.variables()[top.index];
            if (v.count != 1 && top.children < v.count && name == componentName(v, top.children))
                return push(Element, top.children++, true);
            return unexpected(name);
        }
        default:
            return unexpected(name);
    }
}

bool PointCloudXmlHandler::storeField(uint32_t field, std::string_view text) {
    bool ok = true;
    switch (field) {
        case FVersion:
            ok = parseU32(text, raw_.fields.version);
            break;
        case FDescription:
            raw_.fields.description.assign(text);
            break;
        case FType:
            raw_.fields.type.assign(trimSpace(text));
            break;
        case FTypeId:
            ok = parseU32(text, raw_.fields.typeId);
            break;
        case FCompression:
            ok = parseU32(text, raw_.fields.compression);
            break;
        case FNumPoints:
            ok = parseU32(text, raw_.numPoints);
            break;
        case FPointSize:
            ok = parseU32(text, raw_.pointSize);
            break;
        case FNumVariables: {
            uint32_t n = 0;
            ok = parseU32(text, n);
            numVariablesStated_ = n;
            break;
        }
        case FVariableName:
            raw_.variables.back().name.assign(trimSpace(text));
            break;
        case FDataTypeSize:
            ok = parseU32(text, raw_.variables.back().size);
            break;
        case FDataTypeCount:
            ok = parseU32(text, raw_.variables.back().count);
            break;
    }
    if (!ok) return fail("\"" + std::string(trimSpace(text)) + "\" is not a valid header value");
    return true;
}

bool PointCloudXmlHandler::endElement() {
    if (stack_.empty()) return true;
    Frame top = stack_.back();
    stack_.pop_back();
    switch (top.kind) {
        case Field:
        case DefinitionField:
            if (!storeField(top.index, text_)) return false;
            break;
        case CornerPart: {
            float &slot = top.index < 3 ? raw_.fields.boundsMin[int(top.index)]
                                        : raw_.fields.boundsMax[int(top.index - 3)];
            if (!parseF32(text_, slot)) return fail("\"" + text_ + "\" is not a valid corner");
            break;
        }
        case Cell:
            if (!parseF32(text_, raw_.fields.objectToWorld.m[top.index / 4][top.index % 4]))
                return fail("\"" + text_ + "\" is not a valid matrix value");
            break;
        case Definition:
            if (definitionFields_ != 7) return headerFailed();
            break;
        case Sample:
            for (uint32_t k = 0; k < seenVariable_.size(); ++k)
                if (!seenVariable_[k])
                    return fail(formatText("sample %llu has no <%s>",
                                           (unsigned long long)cloud_.size() - 1,
                                           xmlNames_[k].c_str()));
            break;
        case Variable: {
            const PointVariable &v = cloud_.variables()[top.index];
            if (v.count == 1) {
                if (!parseValue(text_, v.type, sample_ + v.offset))
                    return fail(formatText("\"%s\" is not a valid value of <%s> in sample %llu",
                                           std::string(trimSpace(text_)).c_str(),
                                           xmlNames_[top.index].c_str(),
                                           (unsigned long long)cloud_.size() - 1));
            } else if (top.children != v.count) {
                return fail(formatText(
                    "<%s> in sample %llu has %u of its %u values", xmlNames_[top.index].c_str(),
                    (unsigned long long)cloud_.size() - 1, top.children, v.count));
            }
            break;
        }
        case Element: {
            const Frame &var = stack_.back();
            const PointVariable &v = cloud_.variables()[var.index];
            if (!parseValue(text_, v.type,
                            sample_ + v.offset + uint64_t(top.index) * v.elementSize()))
                return fail(formatText("\"%s\" is not a valid value of <%s> in sample %llu",
                                       std::string(trimSpace(text_)).c_str(),
                                       xmlNames_[var.index].c_str(),
                                       (unsigned long long)cloud_.size() - 1));
            break;
        }
        default:
            break;
    }
    text_.clear();
    return true;
}

bool PointCloudXmlHandler::startBody() {
    static const FieldId kRequired[] = {FTypeId, FNumPoints, FPointSize, FNumVariables};
    for (FieldId f : kRequired)
        if (!seenField_[f]) return headerFailed();
    if (!seenField_[FVersion]) raw_.fields.version = kPointCloudVersion;
    if (numVariablesStated_ != raw_.variables.size()) {
        message(kMsgError, 1, "File %s states %u variables but defines %zu", name_.c_str(),
                numVariablesStated_, raw_.variables.size());
        return headerFailed();
    }
    std::vector<PointVariable> variables;
    if (!pcdetail::checkHeader(raw_, name_, false, expected_, variables)) {
        reported_ = true;
        return false;
    }
    cloud_.header() = raw_.fields;
    cloud_.setVariables(std::move(variables));
    xmlNames_.clear();
    for (const PointVariable &v : cloud_.variables()) {
        std::string x(pointVariableXmlName(v.name));
        if (std::find(xmlNames_.begin(), xmlNames_.end(), x) != xmlNames_.end())
            return fail("two variables are written as <" + x + ">");
        xmlNames_.push_back(std::move(x));
    }
    seenVariable_.assign(xmlNames_.size(), 0);
    // Room for the samples the document can hold (each takes dozens of bytes), never more.
    if (cloud_.pointSize() > 0) {
        const uint64_t guess = std::min<uint64_t>(raw_.numPoints, documentBytes_ / 32);
        try {
            cloud_.mutableBytes().reserve(size_t(guess * cloud_.pointSize()));
        } catch (const std::exception &) {
        }
    }
    return true;
}

bool PointCloudXmlHandler::finish(PointCloud &cloud) {
    if (!seenHeader_) return headerFailed();
    if (!seenBody_) {
        // A cloud without samples may leave the body out.
        if (!startBody()) return false;
    }
    if (cloud_.size() != raw_.numPoints) {
        message(kMsgError, 1, "Unexpected end of file in %s!", name_.c_str());
        reported_ = true;
        return false;
    }
    cloud = std::move(cloud_);
    return true;
}

}  // namespace

void appendPointValueText(const uint8_t *element, PointDataType type, std::string &out) {
    char buf[40];
    out.append(valueText(element, type, buf));
}

bool PointCloudXMLReader::process(PointCloud &cloud) {
    const std::string &name = source_.name;
    XmlStreamStatus status;
    std::string why;
    uint64_t size = source_.memory.size();
    if (source_.fromMemory) {
        PointCloudXmlHandler handler(name, expected_, size);
        try {
            status = streamXmlMemory(source_.memory, handler, why);
            if (status == XmlStreamStatus::Ok) return handler.finish(cloud);
        } catch (const std::bad_alloc &) {
            status = XmlStreamStatus::OutOfMemory;
        }
    } else {
        int fd = pcdetail::openForReading(name, size);
        if (fd < 0) return false;
        auto feed = [&](char *buffer, size_t capacity) -> long {
            for (;;) {
                ssize_t n = ::read(fd, buffer, capacity);
                if (n < 0 && errno == EINTR) continue;
                if (n < 0) {
                    message(kMsgError, 1, "Could not read file %s: %s", name.c_str(),
                            std::strerror(errno));
                    return -1;
                }
                return long(n);
            }
        };
        PointCloudXmlHandler handler(name, expected_, size);
        try {
            status = streamXml(feed, handler, why);
        } catch (const std::bad_alloc &) {
            status = XmlStreamStatus::OutOfMemory;
        }
        ::close(fd);
        if (status == XmlStreamStatus::Ok) return handler.finish(cloud);
    }
    switch (status) {
        case XmlStreamStatus::Malformed:
            message(kMsgError, 1, "Could not read point cloud file %s: %s", name.c_str(),
                    why.c_str());
            break;
        case XmlStreamStatus::OutOfMemory:
            message(kMsgError, 1, "Out of memory reading %s", name.c_str());
            break;
        default:
            break;  // the feed or the handler reported the cause
    }
    return false;
}

// ---- writing -----------------------------------------------------------------------------------

bool PointCloudXMLWriter::write(const PointCloud &cloud) {
    const std::string &name = target_.name;
    const PointCloudHeader &h = cloud.header();
    auto refuse = [&](const std::string &why) {
        message(kMsgError, 1, "Could not write file %s: %s", name.c_str(), why.c_str());
        return false;
    };
    if (cloud.size() > UINT32_MAX)
        return refuse(formatText("%llu points are more than a file can hold",
                                 (unsigned long long)cloud.size()));
    if (!isWritableXmlText(h.description))
        return refuse("the description is not text XML can hold");
    if (!isWritableXmlText(h.type)) return refuse("the type name is not text XML can hold");
    std::vector<std::string> xmlNames;
    for (const PointVariable &v : cloud.variables()) {
        std::string x(pointVariableXmlName(v.name));
        if (!isXmlElementName(x) || !isWritableXmlText(v.name))
            return refuse("the variable name \"" + v.name + "\" cannot be an XML element name");
        if (std::find(xmlNames.begin(), xmlNames.end(), x) != xmlNames.end())
            return refuse("two variables would both be written as <" + x + ">");
        xmlNames.push_back(std::move(x));
    }
    const std::string sampleName = isXmlElementName(h.type) ? h.type : "sample";

    XmlStreamWriter w;
    bool ok =
        target_.text ? w.openString(*target_.text, "ISO-8859-1") : w.openFile(name, "ISO-8859-1");
    if (!ok) {
        if (target_.text) return refuse(w.error());
        message(kMsgError, 1, "Could not open file %s for writing!", name.c_str());
        return false;
    }
    char buf[40];
    auto number = [&](const char *element, uint32_t v) {
        auto r = std::to_chars(buf, buf + sizeof buf, v);
        w.element(element, std::string_view(buf, size_t(r.ptr - buf)));
    };
    auto real = [&](const char *element, float v) {
        w.element(element,
                  valueText(reinterpret_cast<const uint8_t *>(&v), PointDataType::Float, buf));
    };
    auto vec3 = [&](const char *element, const Vec3 &v) {
        w.startElement(element);
        real("x", v.x), real("y", v.y), real("z", v.z);
        w.endElement();
    };

    w.startElement("pointCloud");
    w.startElement("header");
    number("version", kPointCloudVersion);
    w.element("description", h.description);
    w.element("type", h.type);
    number("typeId", h.typeId);
    number("compression", h.compression);
    vec3("boundingBoxMinCorner", h.boundsMin);
    vec3("boundingBoxMaxCorner", h.boundsMax);
    w.startElement("objectToWorldMatrix");
    for (int r = 0; r < 4; ++r) {
        w.startElement("r");
        for (int c = 0; c < 4; ++c) real("c", h.objectToWorld.m[r][c]);
        w.endElement();
    }
    w.endElement();
    number("numPoints", uint32_t(cloud.size()));
    number("pointSize", uint32_t(cloud.pointSize()));
    number("numVariables", uint32_t(cloud.variables().size()));
    for (const PointVariable &v : cloud.variables()) {
        w.startElement("variableDefinition");
        w.element("variableName", v.name);
        number("dataTypeSize", v.elementSize());
        number("dataTypeCount", v.count);
        w.endElement();
    }
    w.endElement();  // header

    w.startElement("body");
    const auto &variables = cloud.variables();
    for (uint64_t i = 0, n = cloud.size(); i < n && w.error().empty(); ++i) {
        const uint8_t *p = cloud.point(i);
        w.startElement(sampleName.c_str());
        for (size_t k = 0; k < variables.size(); ++k) {
            const PointVariable &v = variables[k];
            const uint8_t *q = p + v.offset;
            if (v.count == 1) {
                w.element(xmlNames[k].c_str(), valueText(q, v.type, buf));
                continue;
            }
            w.startElement(xmlNames[k].c_str());
            for (uint32_t e = 0; e < v.count; ++e, q += v.elementSize())
                w.element(componentName(v, e), valueText(q, v.type, buf));
            w.endElement();
        }
        w.endElement();
    }
    w.endElement();  // body
    w.endElement();  // pointCloud
    if (!w.finish()) return refuse(w.error());
    return true;
}

}  // namespace ox
