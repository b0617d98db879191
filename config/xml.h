#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>

#include "config/type.h"

/// XML reading, writing and schema of typed value trees, and the streaming reader of scenes.
namespace ox {

struct SaxCallbacks;

/// Largest file the tree reader accepts (256 MiB).
constexpr uint64_t kMaxXmlFileSize = uint64_t(256) << 20;

/// Reads a configuration file into an existing tree; keys the file does not name keep their
/// values. The root element's name is not compared. False (with one error message) when the file
/// cannot be opened, read, parsed or XInclude-processed; the tree is then untouched. Unknown
/// elements, bad enumeration names and unreadable numbers only warn.
bool loadSettings(const std::string &fileName, OXCTypeBase &root);
/// The same from a memory block (document URL "noname.xml": XInclude paths are relative to the
/// current directory).
bool loadSettingsFromMemory(std::string_view document, OXCTypeBase &root);

/// Writes the tree as XML (tab-indented). The file is written under a temporary name in the
/// same directory and renamed, so a failure leaves an existing file intact. On failure errno
/// holds the cause (0 when the cause was not a system error).
bool writeSettings(const std::string &fileName, const OXCTypeBase &root,
                   const char *encoding = "ISO-8859-1");
/// Writes the XML Schema of the tree (the same way), listing undocumented keys as warnings.
bool writeSchema(const std::string &fileName, const OXCTypeBase &root);
/// Writes the tree as XML into a string (for tests and tools); false on writer failure.
bool writeSettingsToString(std::string &out, const OXCTypeBase &root,
                           const char *encoding = "ISO-8859-1");

/// Interface of the XML writers.
class OXCSerializer {
public:
    virtual ~OXCSerializer() = default;
    /// Writes the tree; false on failure (one error message).
    virtual bool serialize(const OXCTypeBase &root) = 0;
};

/// Writes a settings tree to a file.
class XMLSerializer final : public OXCSerializer {
public:
    /// Writes to `fileName` in `encoding`.
    explicit XMLSerializer(std::string fileName, std::string encoding = "ISO-8859-1")
        : fileName_(std::move(fileName)), encoding_(std::move(encoding)) {}
    bool serialize(const OXCTypeBase &root) override {
        return writeSettings(fileName_, root, encoding_.c_str());
    }

private:
    std::string fileName_, encoding_;
};

/// Writes the XML Schema of a settings tree to a file.
class XMLSchemeSerializer final : public OXCSerializer {
public:
    /// Writes to `fileName`.
    explicit XMLSchemeSerializer(std::string fileName) : fileName_(std::move(fileName)) {}
    bool serialize(const OXCTypeBase &root) override { return writeSchema(fileName_, root); }

private:
    std::string fileName_;
};

/// Reads a settings file into a tree (the tree reader).
class XMLDeserializer {
public:
    /// See loadSettings().
    bool deserialize(const std::string &fileName, OXCTypeBase &root) {
        return loadSettings(fileName, root);
    }
};

/// The streaming reader of scene documents: the root element must be "OXScene"; each child is
/// one object, made by the handler registered for its element name when it opens, filled while
/// it is parsed and handed over when it closes, so one object is in memory at a time.
class XMLSAXDeserializer {
public:
    /// Makes a fresh object with defaults for an element; nullptr skips the element.
    using CreateFn = std::function<std::unique_ptr<OXCTypeBase>()>;
    /// Receives the filled object; returning false stops the parse (a failed load).
    using FinishFn = std::function<bool(std::unique_ptr<OXCTypeBase>)>;

    XMLSAXDeserializer();
    ~XMLSAXDeserializer();
    XMLSAXDeserializer(const XMLSAXDeserializer &) = delete;
    XMLSAXDeserializer &operator=(const XMLSAXDeserializer &) = delete;

    /// Registers the handler of top-level elements named `elementName`.
    void addHandler(std::string elementName, CreateFn create, FinishFn finish);

    /// Registers settings class T for `elementName`: each such element becomes a fresh
    /// OXCComplexTypeInstantiator<T> that `onObject` receives after it closed.
    template <typename T>
    void addFactory(std::string elementName, std::function<bool(T &)> onObject) {
        addHandler(
            std::move(elementName),
            [] { return std::unique_ptr<OXCTypeBase>(new OXCComplexTypeInstantiator<T>()); },
            [fn = std::move(onObject)](std::unique_ptr<OXCTypeBase> object) {
                return fn(static_cast<OXCComplexTypeInstantiator<T> &>(*object));
            });
    }

    /// Streams a file. False (one error message) when it cannot be opened or read, is not
    /// well-formed, or a handler stopped the parse; objects finished before stay delivered.
    bool parseFile(const std::string &path);
    /// Streams a memory block.
    bool parseMemory(std::string_view document, const std::string &documentName = "noname.xml");

    /// State of one parse (internal).
    struct Parse;

private:
    friend struct SaxCallbacks;
    struct Handler {
        CreateFn create;
        FinishFn finish;
    };
    std::unordered_map<std::string, Handler> handlers_;
};

}  // namespace ox
