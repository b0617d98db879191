#pragma once

#include <libxml/xmlerror.h>

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "config/type.h"

/// Shared pieces of the XML readers (not part of the public interface).
namespace ox::xmldetail {

/// Which reader's warnings a ValueReader gives.
enum class ReaderStyle : uint8_t {
    Tree,    // configuration files: "Warning, unknown node: ..."
    Stream,  // scene documents: "Unknown member %s of complex type %s", ...
};

/// Fills a value tree from element events (start, text, end) below the element of the root
/// value. Both readers drive it, so they map elements onto values the same way.
class ValueReader {
public:
    explicit ValueReader(ReaderStyle style) : style_(style) {}

    /// Starts filling `root`; its own element is already open.
    void begin(OXCTypeBase &root);
    /// A child element opened.
    void startElement(std::string_view name);
    /// Character data of the innermost open element.
    void characters(std::string_view text) {
        if (!stack_.empty() && stack_.back().collectsText) text_.append(text);
    }
    /// The innermost open element closed.
    void endElement();

private:
    struct Frame {
        enum Kind : uint8_t { Skip, Value, FloatPart, IntPart, Row };
        Kind kind = Skip;
        bool collectsText = false;
        int children = 0;                    // rows of a matrix, columns of a row
        int row = 0;                         // index of a matrix row
        OXCTypeBase *value = nullptr;        // Value, Row (the matrix)
        void *part = nullptr;                // FloatPart, IntPart
        OXCTypeVector *vector = nullptr;     // owner of a pending entry
        std::unique_ptr<OXCTypeBase> entry;  // a vector entry being read
        size_t textStart = 0;
    };

    void pushValue(OXCTypeBase *value);
    void pushPart(void *part, bool isInt);
    void pushSkip() {
        Frame f;
        stack_.push_back(std::move(f));
    }
    void unknownMember(std::string_view name, const std::string &owner);
    void storeText(Frame &frame, std::string_view text);
    void conversionError(std::string_view text);

    ReaderStyle style_;
    std::vector<Frame> stack_;
    std::string text_;
};

/// Opens a file for reading, refusing anything but a regular file; reports one error.
/// Returns the descriptor (or -1) and the file size in `size`.
int openRegularFile(const std::string &path, uint64_t &size);
/// Reads a whole regular file of at most `maxSize` bytes; reports one error on failure.
bool readFileChecked(const std::string &path, uint64_t maxSize, std::string &out);

/// Makes sure the XML library is initialised (once per process).
void initXml();

/// Collects the first error the XML library reports on this thread while it lives and keeps
/// it off the console.
class XmlErrorCapture {
public:
    XmlErrorCapture();
    ~XmlErrorCapture();
    XmlErrorCapture(const XmlErrorCapture &) = delete;
    XmlErrorCapture &operator=(const XmlErrorCapture &) = delete;

    /// "line N: text" of the first error, or empty.
    const std::string &firstError() const { return first_; }
    /// Records an error (first one wins).
    void record(int line, const char *text);

private:
    std::string first_;
    void *previousContext_;
    xmlStructuredErrorFunc previousHandler_;
    void *previousGenericContext_;
    xmlGenericErrorFunc previousGenericHandler_;
};

}  // namespace ox::xmldetail
