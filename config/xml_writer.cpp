#include <libxml/xmlIO.h>
#include <libxml/xmlwriter.h>

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <functional>
#include <new>

#include "config/value_text.h"
#include "config/xml.h"
#include "config/xml_internal.h"
#include "config/xml_stream.h"
#include "core/message.h"
#include "platform/file_system.h"

namespace ox {

namespace {

const xmlChar *X(const char *s) { return reinterpret_cast<const xmlChar *>(s); }

/// Where the writer's bytes go: a file descriptor or a string; remembers the first error.
struct Sink {
    std::FILE *file = nullptr;
    std::string *text = nullptr;
    int error = 0;
};

int sinkWrite(void *context, const char *buffer, int len) {
    auto *sink = static_cast<Sink *>(context);
    if (sink->error) return -1;
    if (sink->text) {
        try {
            sink->text->append(buffer, size_t(len));
        } catch (const std::bad_alloc &) {
            sink->error = ENOMEM;
            return -1;
        }
        return len;
    }
    if (std::fwrite(buffer, 1, size_t(len), sink->file) != size_t(len)) {
        sink->error = errno ? errno : EIO;
        return -1;
    }
    return len;
}

int sinkClose(void *) { return 0; }

/// Writes the element forms of the value types; stops at the first failing writer call.
class XMLWriterVisitor final : public OXCTypeVisitorConst {
public:
    explicit XMLWriterVisitor(xmlTextWriterPtr w) : w_(w) {}

    bool ok() const { return ok_; }
    /// Why writing stopped, when the cause was a value (empty otherwise).
    const std::string &problem() const { return problem_; }
    /// Writes `value` as an element named `name`.
    void write(const OXCTypeBase &value, std::string_view name) {
        if (!ok_) return;
        name_.assign(name);
        value.accept(*this);
    }

    void visit(const OXCType<Mtx4> &v) override {
        const Mtx4 &m = v.get();
        if (!start(name_)) return;
        for (int r = 0; r < 4 && ok_; ++r) {
            if (!start("r")) return;
            for (int c = 0; c < 4; ++c) floatElement("c", m.m[r][c]);
            end();
        }
        end();
    }
    void visit(const OXCEnumBase &v) override {
        v.toString(text_);
        element(name_.c_str(), text_);
    }
    void visit(const OXCComplexType &v) override {
        if (!start(name_)) return;
        for (const auto &m : v.members()) write(*m.value, m.key());
        end();
    }
    void visit(const OXCTypeVector &v) override {
        if (!start(name_)) return;
        for (size_t i = 0; i < v.size(); ++i) write(v.element(i), v.element(i).name());
        end();
    }
    void visit(const OXCType<Vec3> &v) override {
        if (!start(name_)) return;
        floatElement("x", v.get().x);
        floatElement("y", v.get().y);
        floatElement("z", v.get().z);
        end();
    }
    void visit(const OXCType<Vec2> &v) override {
        if (!start(name_)) return;
        floatElement("x", v.get().x);
        floatElement("y", v.get().y);
        end();
    }
    void visit(const OXCType<Vec2i> &v) override {
        if (!start(name_)) return;
        intElement("x", v.get().x);
        intElement("y", v.get().y);
        end();
    }
    void visit(const OXCType<RGBf> &v) override {
        if (!start(name_)) return;
        floatElement("r", v.get().r);
        floatElement("g", v.get().g);
        floatElement("b", v.get().b);
        end();
    }
    void visit(const OXCType<Color> &v) override {
        if (!start(name_)) return;
        floatElement("r", v.get().r);
        floatElement("g", v.get().g);
        floatElement("b", v.get().b);
        floatElement("a", v.get().a);
        end();
    }
    void visit(const OXCType<std::string> &v) override {
        if (!isWritableXmlText(v.get())) {
            // The file could not be read back: refuse it rather than write it.
            problem_ = "the value of " + name_ + " is not UTF-8 text that XML can hold";
            ok_ = false;
            return;
        }
        element(name_.c_str(), v.get());
    }
    void visit(const OXCType<float> &v) override { floatElement(name_.c_str(), v.get()); }
    void visit(const OXCType<bool> &v) override {
        element(name_.c_str(), v.get() ? "true" : "false");
    }
    void visit(const OXCType<uint32_t> &v) override {
        v.toString(text_);
        element(name_.c_str(), text_);
    }
    void visit(const OXCType<int32_t> &v) override { intElement(name_.c_str(), v.get()); }

private:
    bool check(int rc) {
        if (rc < 0) ok_ = false;
        return ok_;
    }
    bool start(const std::string &name) {
        return ok_ && check(xmlTextWriterStartElement(w_, X(name.c_str())));
    }
    bool start(const char *name) { return ok_ && check(xmlTextWriterStartElement(w_, X(name))); }
    void end() {
        if (ok_) check(xmlTextWriterEndElement(w_));
    }
    void element(const char *name, const std::string &text) {
        if (ok_) check(xmlTextWriterWriteElement(w_, X(name), X(text.c_str())));
    }
    void floatElement(const char *name, float v) {
        text_.clear();
        appendFloatText(v, text_);
        element(name, text_);
    }
    void intElement(const char *name, int32_t v) {
        text_ = std::to_string(v);
        element(name, text_);
    }

    xmlTextWriterPtr w_;
    bool ok_ = true;
    std::string name_;
    std::string text_;
    std::string problem_;
};

/// Writes the schema of the value types; stops at the first failing writer call.
class XMLSchemeWriterVisitor final : public OXCTypeVisitorConst {
public:
    explicit XMLSchemeWriterVisitor(xmlTextWriterPtr w) : w_(w) {}

    bool ok() const { return ok_; }
    /// Writes the declaration of `value` as an element named `name` with its documentation;
    /// `optional` lets a document leave the element out (members of settings objects).
    void write(const OXCTypeBase &value, std::string_view name, const std::string *doc,
               bool optional = false) {
        if (!ok_) return;
        name_.assign(name);
        doc_ = doc;
        optional_ = optional;
        value.accept(*this);
    }

    void visit(const OXCType<Mtx4> &) override {
        if (!open(nullptr)) return;
        start("xsd:complexType");
        fourTimesSequence();
        start("xsd:element");
        attr("name", "r");
        start("xsd:complexType");
        fourTimesSequence();
        start("xsd:element");
        attr("name", "c");
        attr("type", "xsd:float");
        end();  // c
        end();  // sequence
        end();  // complexType
        end();  // r
        end();  // sequence
        end();  // complexType
        end();  // element
    }
    void visit(const OXCEnumBase &v) override {
        if (!open(nullptr)) return;
        start("xsd:simpleType");
        start("xsd:restriction");
        attr("base", "xsd:string");
        for (const auto &item : v.table().items()) {
            start("xsd:enumeration");
            attr("value", item.name.c_str());
            end();
        }
        end();
        end();
        end();
    }
    void visit(const OXCComplexType &v) override {
        checkDocumentation(v);
        std::map<std::string, std::string> docs;
        v.getDocumentation(docs);
        if (!open(nullptr)) return;
        start("xsd:complexType");
        start("xsd:sequence");
        for (const auto &m : v.members()) {
            std::string key(m.key());
            auto it = docs.find(key);
            // A file names only the keys it changes; the others keep their defaults.
            write(*m.value, key, it == docs.end() ? nullptr : &it->second, true);
        }
        end();
        end();
        end();
    }
    void visit(const OXCTypeVector &v) override {
        if (!open(nullptr)) return;
        start("xsd:complexType");
        start("xsd:choice");
        attr("minOccurs", "0");
        attr("maxOccurs", "unbounded");
        write(v.prototype(), v.prototype().name(), nullptr);
        end();
        end();
        end();
    }
    void visit(const OXCType<Vec3> &) override { parts("xyz", "xsd:float"); }
    void visit(const OXCType<Vec2> &) override { parts("xy", "xsd:float"); }
    void visit(const OXCType<Vec2i> &) override { parts("xy", "xsd:integer"); }
    void visit(const OXCType<RGBf> &) override { parts("rgb", "xsd:float"); }
    void visit(const OXCType<Color> &) override { parts("rgba", "xsd:float"); }
    void visit(const OXCType<std::string> &) override { simple("xsd:string"); }
    void visit(const OXCType<float> &) override { simple("xsd:float"); }
    void visit(const OXCType<bool> &) override { simple("xsd:boolean"); }
    void visit(const OXCType<uint32_t> &) override { simple("xsd:nonNegativeInteger"); }
    void visit(const OXCType<int32_t> &) override { simple("xsd:integer"); }

private:
    bool check(int rc) {
        if (rc < 0) ok_ = false;
        return ok_;
    }
    void start(const char *name) {
        if (ok_) check(xmlTextWriterStartElement(w_, X(name)));
    }
    void end() {
        if (ok_) check(xmlTextWriterEndElement(w_));
    }
    void attr(const char *name, const char *value) {
        if (ok_) check(xmlTextWriterWriteAttribute(w_, X(name), X(value)));
    }
    /// Starts the "xsd:element" of the current value: its name, then its type attribute (an
    /// attribute must come before any child), then the annotation.
    bool open(const char *type) {
        // Copy first: writing members below reuses name_ and doc_.
        std::string name = name_;
        const std::string *doc = doc_;
        const bool optional = optional_;
        start("xsd:element");
        attr("name", name.c_str());
        if (type) attr("type", type);
        if (optional) attr("minOccurs", "0");
        if (doc) {
            start("xsd:annotation");
            start("xsd:documentation");
            attr("xml:lang", "en");
            if (ok_) check(xmlTextWriterWriteString(w_, X(doc->c_str())));
            end();
            end();
        }
        return ok_;
    }
    void simple(const char *type) {
        if (open(type)) end();
    }
    void parts(const char *names, const char *type) {
        if (!open(nullptr)) return;
        start("xsd:complexType");
        start("xsd:sequence");
        for (const char *p = names; *p; ++p) {
            char n[2] = {*p, 0};
            start("xsd:element");
            attr("name", n);
            attr("type", type);
            end();
        }
        end();
        end();
        end();
    }
    void fourTimesSequence() {
        start("xsd:sequence");
        attr("minOccurs", "4");
        attr("maxOccurs", "4");
    }

    xmlTextWriterPtr w_;
    bool ok_ = true;
    std::string name_;
    const std::string *doc_ = nullptr;
    bool optional_ = false;
};

/// Runs one writer over a sink: document start, indentation, the body, document end, flush.
/// Reports one error message and returns false on the first failing call.
bool writeDocument(Sink &sink, const char *encoding, const std::string &displayName,
                   const std::function<bool(xmlTextWriterPtr, std::string &)> &body) {
    xmldetail::XmlErrorCapture errors;
    xmlOutputBufferPtr out = xmlOutputBufferCreateIO(sinkWrite, sinkClose, &sink, nullptr);
    xmlTextWriterPtr w = out ? xmlNewTextWriter(out) : nullptr;
    if (!w) {
        if (out) xmlOutputBufferClose(out);
        message(kMsgError, 1, "Error creating xml writer");
        return false;
    }
    bool ok = true;
    if (xmlTextWriterStartDocument(w, nullptr, encoding, nullptr) < 0) {
        message(kMsgError, 1, "Error starting xml document");
        ok = false;
    } else if (xmlTextWriterSetIndent(w, 1) < 0 || xmlTextWriterSetIndentString(w, X("\t")) < 0) {
        message(kMsgError, 1, "Error creating xml writer");
        ok = false;
    } else if (std::string why; !body(w, why)) {
        if (why.empty())
            message(kMsgError, 1, "Error writing xml file %s", displayName.c_str());
        else
            message(kMsgError, 1, "Error writing xml file %s: %s", displayName.c_str(),
                    why.c_str());
        ok = false;
    } else if (xmlTextWriterEndDocument(w) < 0 || xmlTextWriterFlush(w) < 0) {
        message(kMsgError, 1, "Error ending xml document");
        ok = false;
    }
    xmlFreeTextWriter(w);  // also frees the output buffer
    if (ok && sink.error) {
        message(kMsgError, 1, "Error writing xml file %s: %s", displayName.c_str(),
                std::strerror(sink.error));
        ok = false;
    }
    return ok;
}

/// Writes a file through a temporary name in the target directory and renames it into place.
/// On failure the temporary file is removed, the target is unchanged and errno holds the cause
/// (0 if none).
bool writeFileAtomically(const std::string &fileName, const char *encoding,
                         const std::function<bool(xmlTextWriterPtr, std::string &)> &body) {
    AtomicFile file(fileName);
    Sink sink;
    sink.file = file.file();
    if (!sink.file) {
        message(kMsgError, 1, "Error creating xml writer");
        errno = FileSystemUtilities::lastError();
        return false;
    }
    if (!writeDocument(sink, encoding, fileName, body)) {
        errno = sink.error;
        return false;
    }
    if (!file.commit()) {
        const int err = FileSystemUtilities::lastError();
        message(kMsgError, 1, "Error writing xml file %s: %s", fileName.c_str(),
                std::strerror(err));
        errno = err;
        return false;
    }
    return true;
}

bool writeSettingsBody(xmlTextWriterPtr w, const OXCTypeBase &root, std::string &why) {
    XMLWriterVisitor v(w);
    v.write(root, root.name());
    why = v.problem();
    return v.ok();
}

bool writeSchemaBody(xmlTextWriterPtr w, const OXCTypeBase &root, std::string &) {
    if (xmlTextWriterStartElement(w, X("xsd:schema")) < 0 ||
        xmlTextWriterWriteAttribute(w, X("xmlns:xsd"), X("http://www.w3.org/2001/XMLSchema")) < 0)
        return false;
    XMLSchemeWriterVisitor v(w);
    v.write(root, root.name(), nullptr);
    return v.ok() && xmlTextWriterEndElement(w) >= 0;
}

}  // namespace

bool writeSettings(const std::string &fileName, const OXCTypeBase &root, const char *encoding) {
    return writeFileAtomically(fileName, encoding, [&](xmlTextWriterPtr w, std::string &why) {
        return writeSettingsBody(w, root, why);
    });
}

bool writeSchema(const std::string &fileName, const OXCTypeBase &root) {
    return writeFileAtomically(fileName, nullptr, [&](xmlTextWriterPtr w, std::string &why) {
        return writeSchemaBody(w, root, why);
    });
}

bool writeSettingsToString(std::string &out, const OXCTypeBase &root, const char *encoding) {
    out.clear();
    Sink sink;
    sink.text = &out;
    return writeDocument(sink, encoding, "(memory)", [&](xmlTextWriterPtr w, std::string &why) {
        return writeSettingsBody(w, root, why);
    });
}

}  // namespace ox
