#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <string>
#include <string_view>

/// Element-by-element XML reading and writing for file formats that are not settings trees
/// (point clouds). Reading is locked down like the settings readers: no document type
/// declarations, no entities beyond the five predefined ones, no network, no XInclude.
namespace ox {

/// Receives the element events of a streamed document. Returning false from any operation stops
/// the parse; the handler reports why.
class XmlStreamHandler {
public:
    virtual ~XmlStreamHandler() = default;
    /// An element opened (attributes are ignored).
    virtual bool startElement(std::string_view name) = 0;
    /// Character data of the innermost open element; may arrive in several pieces.
    virtual bool characters(std::string_view text) = 0;
    /// The innermost open element closed.
    virtual bool endElement() = 0;
};

/// Supplies the next bytes of a document: returns the count written to the buffer, 0 at the end,
/// -1 on a read error (which the supplier reports).
using XmlFeed = std::function<long(char *buffer, size_t capacity)>;

/// Why a streamed parse ended without success.
enum class XmlStreamStatus {
    Ok,
    ReadError,       ///< the feed failed (it reported the cause)
    HandlerStopped,  ///< the handler refused an event (it reported the cause)
    Malformed,       ///< not well-formed, or a document type declaration was present
    OutOfMemory,
};

/// Streams a document through `handler`. On Malformed and OutOfMemory, `error` receives a text
/// such as "line 3: Opening and ending tag mismatch"; no message is printed.
XmlStreamStatus streamXml(const XmlFeed &feed, XmlStreamHandler &handler, std::string &error);
/// The same from a memory block.
XmlStreamStatus streamXmlMemory(std::string_view document, XmlStreamHandler &handler,
                                std::string &error);

/// Writes an XML document element by element, tab-indented, to a file (through a temporary
/// name in the same directory, renamed into place by finish()) or to a string. Calls after the
/// first failure do nothing; finish() reports whether everything succeeded. Prints nothing.
class XmlStreamWriter {
public:
    XmlStreamWriter();
    /// Removes the temporary file unless finish() succeeded.
    ~XmlStreamWriter();
    XmlStreamWriter(const XmlStreamWriter &) = delete;
    XmlStreamWriter &operator=(const XmlStreamWriter &) = delete;

    /// Starts a document that will replace `fileName`; false when the temporary file cannot be
    /// created.
    bool openFile(const std::string &fileName, const char *encoding);
    /// Starts a document written into `out`.
    bool openString(std::string &out, const char *encoding);
    /// Opens an element; `name` must be a valid element name.
    bool startElement(const char *name);
    /// Closes the innermost element.
    bool endElement();
    /// Writes <name>text</name>; `text` must be UTF-8 (markup characters are escaped).
    bool element(const char *name, std::string_view text);
    /// Ends the document, flushes it and, for a file, syncs and renames it into place.
    bool finish();
    /// The cause of the first failure ("" while none).
    const std::string &error() const;

    struct Impl;

private:
    std::unique_ptr<Impl> impl_;
};

/// True for valid UTF-8 without the control characters XML 1.0 cannot carry.
bool isWritableXmlText(std::string_view text);
/// True for a name that can stand as an XML element name (ASCII letters, digits, "_", "-", "."
/// and not starting with a digit, "-" or ".").
bool isXmlElementName(std::string_view name);

}  // namespace ox
