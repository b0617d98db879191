#include <fcntl.h>
#include <libxml/parser.h>
#include <libxml/parserInternals.h>
#include <libxml/tree.h>
#include <libxml/uri.h>
#include <libxml/xinclude.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <mutex>
#include <new>

#include "config/value_text.h"
#include "config/xml.h"
#include "config/xml_internal.h"
#include "core/message.h"

namespace ox {
namespace xmldetail {

// ---- element events onto values ----------------------------------------------------------------

namespace {

bool collectsText(OXCKind k) {
    switch (k) {
        case OXCKind::Enum:
        case OXCKind::String:
        case OXCKind::Float:
        case OXCKind::Bool:
        case OXCKind::UInt:
        case OXCKind::Int:
            return true;
        default:
            return false;
    }
}

/// The component of a small aggregate named `name`, or nullptr.
float *floatPart(OXCTypeBase &v, std::string_view name) {
    if (name.size() != 1) return nullptr;
    char c = name[0];
    switch (v.kind()) {
        case OXCKind::Vec2f: {
            Vec2 &p = static_cast<OXCType<Vec2> &>(v).ref();
            return c == 'x' ? &p.x : c == 'y' ? &p.y : nullptr;
        }
        case OXCKind::Vec3: {
            Vec3 &p = static_cast<OXCType<Vec3> &>(v).ref();
            return c == 'x' ? &p.x : c == 'y' ? &p.y : c == 'z' ? &p.z : nullptr;
        }
        case OXCKind::RGB: {
            RGBf &p = static_cast<OXCType<RGBf> &>(v).ref();
            return c == 'r' ? &p.r : c == 'g' ? &p.g : c == 'b' ? &p.b : nullptr;
        }
        case OXCKind::Color: {
            Color &p = static_cast<OXCType<Color> &>(v).ref();
            return c == 'r' ? &p.r : c == 'g' ? &p.g : c == 'b' ? &p.b : c == 'a' ? &p.a : nullptr;
        }
        default:
            return nullptr;
    }
}

}  // namespace

void ValueReader::begin(OXCTypeBase &root) {
    stack_.clear();
    text_.clear();
    pushValue(&root);
}

void ValueReader::pushValue(OXCTypeBase *value) {
    Frame f;
    f.kind = Frame::Value;
    f.value = value;
    f.collectsText = collectsText(value->kind());
    f.textStart = text_.size();
    stack_.push_back(std::move(f));
}

void ValueReader::pushPart(void *part, bool isInt) {
    Frame f;
    f.kind = isInt ? Frame::IntPart : Frame::FloatPart;
    f.part = part;
    f.collectsText = true;
    f.textStart = text_.size();
    stack_.push_back(std::move(f));
}

void ValueReader::unknownMember(std::string_view name, const std::string &owner) {
    std::string n(name);
    if (style_ == ReaderStyle::Tree)
        messageText(kMsgWarning, 1, "Warning, unknown node: " + n);
    else
        message(kMsgWarning, 1, "Unknown member %s of complex type %s", n.c_str(), owner.c_str());
}

void ValueReader::conversionError(std::string_view text) {
    std::string t(text);
    message(kMsgWarning, 1, "Type conversion error when assigning value %s", t.c_str());
}

void ValueReader::startElement(std::string_view name) {
    if (stack_.empty()) return;
    Frame &top = stack_.back();
    switch (top.kind) {
        case Frame::Skip:
        case Frame::FloatPart:
        case Frame::IntPart:
            if (top.kind != Frame::Skip)
                unknownMember(name, top.kind == Frame::IntPart ? "int" : "float");
            return pushSkip();
        case Frame::Row: {
            if (name == "c" && top.children < 4) {
                Mtx4 &m = static_cast<OXCType<Mtx4> &>(*top.value).ref();
                return pushPart(&m.m[top.row][top.children++], false);
            }
            unknownMember(name, "r");
            return pushSkip();
        }
        case Frame::Value:
            break;
    }

    OXCTypeBase &v = *top.value;
    switch (v.kind()) {
        case OXCKind::Complex: {
            OXCTypeBase *member = static_cast<OXCComplexType &>(v).findMember(name);
            if (!member) {
                unknownMember(name, v.name());
                return pushSkip();
            }
            return pushValue(member);
        }
        case OXCKind::Vector: {
            auto &vec = static_cast<OXCTypeVector &>(v);
            // Entries are written under their own name (the type name of settings objects) and
            // hand-written files use "element": both are accepted.
            if (name != "element" && name != vec.prototype().name()) {
                std::string n(name);
                if (style_ == ReaderStyle::Tree)
                    messageText(kMsgWarning, 1, "Warning, unknown node: " + n);
                else
                    message(kMsgWarning, 1, "Trying to assign a node of type %s to a node named %s",
                            n.c_str(), vec.name().c_str());
                return pushSkip();
            }
            std::unique_ptr<OXCTypeBase> entry = vec.newElement();
            OXCTypeBase *raw = entry.get();
            pushValue(raw);
            stack_.back().vector = &vec;
            stack_.back().entry = std::move(entry);
            return;
        }
        case OXCKind::Vec2i: {
            Vec2i &p = static_cast<OXCType<Vec2i> &>(v).ref();
            if (name == "x") return pushPart(&p.x, true);
            if (name == "y") return pushPart(&p.y, true);
            break;
        }
        case OXCKind::Mtx4:
            if (name == "r" && top.children < 4) {
                Frame f;
                f.kind = Frame::Row;
                f.value = &v;
                f.row = top.children++;
                stack_.push_back(std::move(f));
                return;
            }
            break;
        default:
            if (float *p = floatPart(v, name)) return pushPart(p, false);
            break;
    }
    unknownMember(name, v.name());
    pushSkip();
}

void ValueReader::storeText(Frame &frame, std::string_view raw) {
    std::string_view text = trimXmlSpace(raw);
    if (frame.kind == Frame::FloatPart) {
        if (!parseFloat(text, *static_cast<float *>(frame.part))) conversionError(text);
        return;
    }
    if (frame.kind == Frame::IntPart) {
        if (!parseInt32(text, *static_cast<int32_t *>(frame.part))) conversionError(text);
        return;
    }
    OXCTypeBase &v = *frame.value;
    switch (v.kind()) {
        case OXCKind::String:
            static_cast<OXCType<std::string> &>(v).ref().assign(text);
            break;
        case OXCKind::Float:
            if (!parseFloat(text, static_cast<OXCType<float> &>(v).ref())) conversionError(text);
            break;
        case OXCKind::Int:
            if (!parseInt32(text, static_cast<OXCType<int32_t> &>(v).ref())) conversionError(text);
            break;
        case OXCKind::UInt:
            if (!parseUInt32(text, static_cast<OXCType<uint32_t> &>(v).ref()))
                conversionError(text);
            break;
        case OXCKind::Bool:
            if (!parseBool(text, static_cast<OXCType<bool> &>(v).ref())) conversionError(text);
            break;
        case OXCKind::Enum: {
            auto &e = static_cast<OXCEnumBase &>(v);
            if (!e.setFromString(text))
                messageText(
                    kMsgWarning, 1,
                    "Warning, could not set value " + std::string(text) + " for enum " + e.name());
            break;
        }
        default:
            break;
    }
}

void ValueReader::endElement() {
    if (stack_.empty()) return;
    Frame &top = stack_.back();
    if (top.collectsText) {
        storeText(top, std::string_view(text_).substr(top.textStart));
        text_.resize(top.textStart);
    }
    if (top.entry) top.vector->append(std::move(top.entry));
    stack_.pop_back();
}

// ---- files -------------------------------------------------------------------------------------

int openRegularFile(const std::string &path, uint64_t &size) {
    // Non-blocking open: a named pipe must be refused, not waited on.
    int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY | O_NONBLOCK);
    if (fd < 0) {
        message(kMsgError, 1, "Error opening file %s in xmlsource", path.c_str());
        return -1;
    }
    struct stat st;
    if (::fstat(fd, &st) != 0) {
        int err = errno;
        ::close(fd);
        message(kMsgError, 1, "Error in tellg on file %s", path.c_str());
        errno = err;
        return -1;
    }
    if (!S_ISREG(st.st_mode)) {
        ::close(fd);
        message(kMsgError, 1, "Error opening file %s in xmlsource: not a regular file",
                path.c_str());
        errno = EINVAL;
        return -1;
    }
    int flags = ::fcntl(fd, F_GETFL);
    if (flags >= 0) ::fcntl(fd, F_SETFL, flags & ~O_NONBLOCK);
    size = uint64_t(st.st_size);
    return fd;
}

bool readFileChecked(const std::string &path, uint64_t maxSize, std::string &out) {
    uint64_t size = 0;
    int fd = openRegularFile(path, size);
    if (fd < 0) return false;
    if (size > maxSize) {
        ::close(fd);
        message(kMsgError, 1, "File %s is too large (%llu bytes, the limit is %llu)", path.c_str(),
                (unsigned long long)size, (unsigned long long)maxSize);
        errno = EFBIG;
        return false;
    }
    // Read to the end, whatever size was reported (files under /proc report 0), with the cap
    // on the bytes actually read.
    uint64_t done = 0;
    bool tooLarge = false;
    int err = 0;
    try {
        out.resize(size_t(size));
        for (;;) {
            if (done == out.size()) {
                if (done >= maxSize) {
                    char probe;
                    ssize_t n = ::read(fd, &probe, 1);
                    if (n < 0 && errno == EINTR) continue;
                    tooLarge = n > 0;
                    if (n < 0) err = errno;
                    break;
                }
                out.resize(size_t(std::min<uint64_t>(maxSize, std::max<uint64_t>(done * 2, 4096))));
            }
            ssize_t n = ::read(fd, out.data() + done, size_t(out.size() - done));
            if (n < 0 && errno == EINTR) continue;
            if (n < 0) err = errno;
            if (n <= 0) break;
            done += uint64_t(n);
        }
    } catch (const std::bad_alloc &) {
        ::close(fd);
        message(kMsgError, 1, "Out of memory reading file %s", path.c_str());
        errno = ENOMEM;
        return false;
    }
    ::close(fd);
    if (tooLarge) {
        message(kMsgError, 1, "File %s is too large (more than %llu bytes)", path.c_str(),
                (unsigned long long)maxSize);
        errno = EFBIG;
        return false;
    }
    if (err != 0) {
        message(kMsgError, 1, "Error reading file %s (%llu of %llu bytes read)", path.c_str(),
                (unsigned long long)done, (unsigned long long)size);
        errno = err;
        return false;
    }
    out.resize(size_t(done));
    return true;
}

void initXml() {
    static std::once_flag once;
    std::call_once(once, [] { xmlInitParser(); });
}

// ---- library errors
// ------------------------------------------------------------------------------

namespace {

void structuredError(void *ctx, xmlErrorPtr error) {
    if (!ctx || !error) return;
    static_cast<XmlErrorCapture *>(ctx)->record(error->line, error->message);
}

void genericError(void *ctx, const char *msg, ...) {
    if (ctx) static_cast<XmlErrorCapture *>(ctx)->record(0, msg);
}

}  // namespace

XmlErrorCapture::XmlErrorCapture() {
    initXml();
    previousContext_ = xmlStructuredErrorContext;
    previousHandler_ = xmlStructuredError;
    previousGenericContext_ = xmlGenericErrorContext;
    previousGenericHandler_ = xmlGenericError;
    xmlSetStructuredErrorFunc(this, structuredError);
    xmlSetGenericErrorFunc(this, genericError);
}

XmlErrorCapture::~XmlErrorCapture() {
    xmlSetStructuredErrorFunc(previousContext_, previousHandler_);
    xmlSetGenericErrorFunc(previousGenericContext_, previousGenericHandler_);
}

void XmlErrorCapture::record(int line, const char *text) {
    if (!first_.empty() || !text) return;
    std::string t(text);
    while (!t.empty() && (t.back() == '\n' || t.back() == '\r')) t.pop_back();
    first_ = line > 0 ? "line " + std::to_string(line) + ": " + t : t;
}

}  // namespace xmldetail

// ---- the tree reader
// -----------------------------------------------------------------------------

namespace {

using xmldetail::ReaderStyle;
using xmldetail::ValueReader;

xmlExternalEntityLoader gPreviousLoader = nullptr;

/// Loads files that XInclude (or the library) asks for: local regular files within the size
/// limit only, never the network; the library's own loader is never asked.
xmlParserInputPtr checkedEntityLoader(const char *url, const char *id, xmlParserCtxtPtr ctxt) {
    if (!url) return nullptr;
    std::string_view u(url);
    std::string path;
    if (u.substr(0, 7) == "file://") {
        char *unescaped = xmlURIUnescapeString(url + 7, 0, nullptr);
        if (!unescaped) return nullptr;
        path = unescaped;
        xmlFree(unescaped);
    } else if (u.find("://") != std::string_view::npos) {
        return nullptr;  // no network access
    } else {
        path.assign(u);
    }
    // The file is read here, with the cap on the bytes actually read: files under /proc
    // report the size 0 whatever they hold, and a pipe must not be waited on.
    const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY | O_NONBLOCK);
    if (fd < 0) return nullptr;
    struct stat st;
    if (::fstat(fd, &st) != 0 || !S_ISREG(st.st_mode) || uint64_t(st.st_size) > kMaxXmlFileSize) {
        ::close(fd);
        return nullptr;
    }
    std::string data;
    bool ok = true;
    try {
        char chunk[1 << 16];
        for (;;) {
            const ssize_t n = ::read(fd, chunk, sizeof chunk);
            if (n < 0 && errno == EINTR) continue;
            if (n < 0) ok = false;
            if (n <= 0) break;
            if (data.size() + size_t(n) > kMaxXmlFileSize) {
                ok = false;
                break;
            }
            data.append(chunk, size_t(n));
        }
    } catch (const std::bad_alloc &) {
        ok = false;
    }
    ::close(fd);
    if (!ok || data.size() > size_t(INT32_MAX)) return nullptr;
    // The buffer keeps its own copy of the bytes.
    xmlParserInputBufferPtr buffer =
        xmlParserInputBufferCreateMem(data.data(), int(data.size()), XML_CHAR_ENCODING_NONE);
    if (!buffer) return nullptr;
    xmlParserInputPtr input = xmlNewIOInputStream(ctxt, buffer, XML_CHAR_ENCODING_NONE);
    if (!input) {
        xmlFreeParserInputBuffer(buffer);
        return nullptr;
    }
    // The name lets relative references inside the included file resolve against it.
    input->filename =
        reinterpret_cast<const char *>(xmlCanonicPath(reinterpret_cast<const xmlChar *>(url)));
    return input;
}

/// Installs the checked loader for the duration of one load. The loader is process-wide in
/// the XML library, so loads on several threads take turns.
std::mutex gLoaderMutex;

class LoaderGuard {
public:
    LoaderGuard() : lock_(gLoaderMutex) {
        gPreviousLoader = xmlGetExternalEntityLoader();
        xmlSetExternalEntityLoader(checkedEntityLoader);
    }
    ~LoaderGuard() { xmlSetExternalEntityLoader(gPreviousLoader); }

private:
    std::lock_guard<std::mutex> lock_;
};

/// Feeds a parsed element tree to the value reader without recursion.
void walkTree(xmlNode *root, ValueReader &reader) {
    xmlNode *n = root->children;
    while (n) {
        if (n->type == XML_ELEMENT_NODE) {
            reader.startElement(reinterpret_cast<const char *>(n->name));
            if (n->children) {
                n = n->children;
                continue;
            }
            reader.endElement();
        } else if ((n->type == XML_TEXT_NODE || n->type == XML_CDATA_SECTION_NODE) && n->content) {
            reader.characters(reinterpret_cast<const char *>(n->content));
        }
        // Entity references are never expanded: their text is not part of any value.
        while (n && !n->next) {
            n = n->parent;
            if (!n || n == root) return;
            reader.endElement();
        }
        if (n) n = n->next;
    }
}

bool loadDocument(std::string_view data, OXCTypeBase &root, const std::string &displayName) {
    xmldetail::XmlErrorCapture errors;
    LoaderGuard loader;
    if (data.size() > size_t(INT32_MAX)) {
        message(kMsgError, 1, "Error parsing file %s in xmlsource", displayName.c_str());
        return false;
    }
    constexpr int kOptions = XML_PARSE_NONET | XML_PARSE_NOBLANKS | XML_PARSE_COMPACT;
    xmlParserCtxtPtr ctxt = xmlNewParserCtxt();
    if (!ctxt) {
        message(kMsgError, 1, "Error parsing file %s in xmlsource", displayName.c_str());
        return false;
    }
    xmlDocPtr doc =
        xmlCtxtReadMemory(ctxt, data.data(), int(data.size()), "noname.xml", nullptr, kOptions);
    xmlFreeParserCtxt(ctxt);
    if (!doc) {
        if (!errors.firstError().empty())
            message(kMsgWarning, 1, "%s: %s", displayName.c_str(), errors.firstError().c_str());
        message(kMsgError, 1, "Error parsing file %s in xmlsource", displayName.c_str());
        return false;
    }
    int included = xmlXIncludeProcessFlags(doc, kOptions | XML_PARSE_NOXINCNODE);
    if (included < 0) {
        if (!errors.firstError().empty())
            message(kMsgWarning, 1, "%s: %s", displayName.c_str(), errors.firstError().c_str());
        message(kMsgError, 1, "XInclude processing failed");
        xmlFreeDoc(doc);
        return false;
    }
    if (included > 0) message(kMsgInfo, 1, "Did XInclude inclusions");
    xmlNode *top = xmlDocGetRootElement(doc);
    if (!top) {
        message(kMsgError, 1, "No document root xmlsource");
        xmlFreeDoc(doc);
        return false;
    }
    bool ok = true;
    try {
        ValueReader reader(ReaderStyle::Tree);
        reader.begin(root);
        walkTree(top, reader);
    } catch (const std::bad_alloc &) {
        message(kMsgError, 1, "Out of memory reading %s", displayName.c_str());
        ok = false;
    }
    xmlFreeDoc(doc);
    return ok;
}

}  // namespace

bool loadSettings(const std::string &fileName, OXCTypeBase &root) {
    std::string data;
    if (!xmldetail::readFileChecked(fileName, kMaxXmlFileSize, data)) return false;
    return loadDocument(data, root, fileName);
}

bool loadSettingsFromMemory(std::string_view document, OXCTypeBase &root) {
    return loadDocument(document, root, "noname.xml");
}

}  // namespace ox
