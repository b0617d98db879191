#include <cerrno>
#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "config/value_text.h"
#include "config/xml_stream.h"
#include "core/message.h"
#include "render/post_filter.h"

/// The "MinMaxData" XML: root "MinMaxRoot" with the image-wide components ("imgMinMaxVec") and
/// one "ShapeMinMax" per instance ("minMaxVec"), each a "shape" name and its
/// "ComponentMinMaxVec"; every "ComponentMinMax" holds "minVal", "maxVal" and "remapped".
namespace ox {

namespace {

/// A shape name as XML can carry it: bytes it cannot hold become '?'.
std::string writableName(const std::string &name) {
    if (isWritableXmlText(name)) return name;
    std::string out = name;
    for (char &c : out)
        if (static_cast<unsigned char>(c) < 0x20 || static_cast<unsigned char>(c) >= 0x7f) c = '?';
    return out;
}

void writeComponents(XmlStreamWriter &w, const std::vector<ComponentMinMax> &components) {
    std::string text;
    for (const ComponentMinMax &c : components) {
        w.startElement("ComponentMinMax");
        text.clear();
        appendFloatText(c.minVal, text);
        w.element("minVal", text);
        text.clear();
        appendFloatText(c.maxVal, text);
        w.element("maxVal", text);
        w.element("remapped", c.remapped ? "true" : "false");
        w.endElement();
    }
}

/// Reads the record element by element; any element out of place stops the read.
class MinMaxHandler final : public XmlStreamHandler {
public:
    MinMaxHandler(const std::string &fileName, MinMaxData &data)
        : fileName_(fileName), data_(data) {}

    bool startElement(std::string_view name) override {
        const std::string parent = path_.empty() ? std::string() : path_.back();
        bool ok = false;
        if (path_.empty())
            ok = name == "MinMaxRoot";
        else if (parent == "MinMaxRoot")
            ok = name == "imgMinMaxVec" || name == "minMaxVec";
        else if (parent == "imgMinMaxVec" && name == "ComponentMinMax")
            ok = (data_.image.emplace_back(), true);
        else if (parent == "minMaxVec" && name == "ShapeMinMax")
            ok = (data_.shapes.emplace_back(), true);
        else if (parent == "ShapeMinMax")
            ok = name == "shape" || name == "ComponentMinMaxVec";
        else if (parent == "ComponentMinMaxVec" && name == "ComponentMinMax")
            ok = (data_.shapes.back().components.emplace_back(), true);
        else if (parent == "ComponentMinMax")
            ok = name == "minVal" || name == "maxVal" || name == "remapped";
        if (!ok) {
            message(kMsgError, 6, "Unexpected element %.*s in MinMaxData file %s", int(name.size()),
                    name.data(), fileName_.c_str());
            return false;
        }
        path_.emplace_back(name);
        text_.clear();
        return true;
    }

    bool characters(std::string_view text) override {
        if (text_.size() + text.size() > kMaxText) {
            message(kMsgError, 6, "Text too long in MinMaxData file %s", fileName_.c_str());
            return false;
        }
        text_.append(text);
        return true;
    }

    bool endElement() override {
        const std::string name = path_.back();
        path_.pop_back();
        const std::string_view text = trimXmlSpace(text_);
        bool ok = true;
        if (name == "shape") {
            data_.shapes.back().shape = std::string(text);
        } else if (name == "minVal" || name == "maxVal" || name == "remapped") {
            ComponentMinMax &c = path_.size() >= 2 && path_[path_.size() - 2] == "imgMinMaxVec"
                                     ? data_.image.back()
                                     : data_.shapes.back().components.back();
            ok = name == "remapped" ? parseBool(text, c.remapped)
                                    : parseFloat(text, name == "minVal" ? c.minVal : c.maxVal);
        } else if (!text.empty()) {
            ok = false;
        }
        if (!ok)
            message(kMsgError, 6, "Bad value \"%.*s\" of %s in MinMaxData file %s",
                    int(std::min<size_t>(text.size(), 64)), text.data(), name.c_str(),
                    fileName_.c_str());
        text_.clear();
        return ok;
    }

private:
    static constexpr size_t kMaxText = 4096;
    const std::string &fileName_;
    MinMaxData &data_;
    std::vector<std::string> path_;
    std::string text_;
};

}  // namespace

bool writeMinMaxData(const std::string &fileName, const MinMaxData &data) {
    XmlStreamWriter w;
    if (w.openFile(fileName, "UTF-8")) {
        w.startElement("MinMaxRoot");
        w.startElement("imgMinMaxVec");
        writeComponents(w, data.image);
        w.endElement();
        w.startElement("minMaxVec");
        for (const ShapeMinMax &s : data.shapes) {
            w.startElement("ShapeMinMax");
            w.element("shape", writableName(s.shape));
            w.startElement("ComponentMinMaxVec");
            writeComponents(w, s.components);
            w.endElement();
            w.endElement();
        }
        w.endElement();
        w.endElement();
        if (w.finish()) return true;
    }
    message(kMsgError, 6, "Could not write MinMaxData file %s: %s", fileName.c_str(),
            w.error().c_str());
    return false;
}

bool readMinMaxData(const std::string &fileName, MinMaxData &data) {
    std::FILE *file = std::fopen(fileName.c_str(), "rb");
    if (!file) {
        message(kMsgError, 6, "Could not open MinMaxData file %s: %s", fileName.c_str(),
                std::strerror(errno));
        return false;
    }
    auto feed = [&](char *buffer, size_t capacity) -> long {
        const size_t n = std::fread(buffer, 1, capacity, file);
        if (n == 0 && std::ferror(file)) {
            message(kMsgError, 6, "Could not read MinMaxData file %s", fileName.c_str());
            return -1;
        }
        return long(n);
    };
    MinMaxData read;
    MinMaxHandler handler(fileName, read);
    std::string why;
    XmlStreamStatus status;
    try {
        status = streamXml(feed, handler, why);
    } catch (const std::bad_alloc &) {
        status = XmlStreamStatus::OutOfMemory;
    }
    std::fclose(file);
    if (status == XmlStreamStatus::Ok) {
        data = std::move(read);
        return true;
    }
    if (status == XmlStreamStatus::Malformed)
        message(kMsgError, 6, "Could not read MinMaxData file %s: %s", fileName.c_str(),
                why.c_str());
    else if (status == XmlStreamStatus::OutOfMemory)
        message(kMsgError, 6, "Out of memory reading MinMaxData file %s", fileName.c_str());
    return false;
}

}  // namespace ox
