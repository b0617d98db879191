#include "config/xml_stream.h"

#include <libxml/entities.h>
#include <libxml/parser.h>
#include <libxml/parserInternals.h>
#include <libxml/xmlIO.h>
#include <libxml/xmlwriter.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <new>
#include <optional>

#include "config/xml_internal.h"
#include "platform/file_system.h"

namespace ox {

// ---- reading -----------------------------------------------------------------------------------

namespace {

struct StreamParse {
    XmlStreamHandler *handler = nullptr;
    xmlParserCtxtPtr ctxt = nullptr;
    bool stopped = false;    // the handler refused an event
    bool doctype = false;    // a document type declaration appeared
    bool exception = false;  // out of memory inside a callback
    std::string firstError;

    void stop() {
        if (ctxt) xmlStopParser(ctxt);
    }
    template <typename F>
    void guarded(F &&f) {
        if (stopped || doctype || exception) return;
        try {
            if (!f()) {
                stopped = true;
                stop();
            }
        } catch (const std::bad_alloc &) {
            exception = true;
            stop();
        }
    }
};

void onStart(void *ctx, const xmlChar *localname, const xmlChar *, const xmlChar *, int,
             const xmlChar **, int, int, const xmlChar **) {
    auto *p = static_cast<StreamParse *>(ctx);
    p->guarded([&] { return p->handler->startElement(reinterpret_cast<const char *>(localname)); });
}

void onEnd(void *ctx, const xmlChar *, const xmlChar *, const xmlChar *) {
    auto *p = static_cast<StreamParse *>(ctx);
    p->guarded([&] { return p->handler->endElement(); });
}

void onCharacters(void *ctx, const xmlChar *text, int len) {
    auto *p = static_cast<StreamParse *>(ctx);
    p->guarded([&] {
        return p->handler->characters(
            std::string_view(reinterpret_cast<const char *>(text), size_t(len)));
    });
}

/// Only the five predefined entities exist.
xmlEntityPtr onGetEntity(void *, const xmlChar *name) { return xmlGetPredefinedEntity(name); }

/// Any document type declaration ends the parse: these documents never need one, and refusing
/// it keeps entity declarations and external subsets out entirely.
void onInternalSubset(void *ctx, const xmlChar *, const xmlChar *, const xmlChar *) {
    auto *p = static_cast<StreamParse *>(ctx);
    p->doctype = true;
    p->stop();
}

void onError(void *ctx, xmlErrorPtr err) {
    auto *p = static_cast<StreamParse *>(ctx);
    if (!err || !p->firstError.empty() || err->level < XML_ERR_ERROR) return;
    std::string text = err->message ? err->message : "unknown error";
    while (!text.empty() && (text.back() == '\n' || text.back() == '\r')) text.pop_back();
    p->firstError = "line " + std::to_string(err->line) + ": " + text;
}

}  // namespace

XmlStreamStatus streamXml(const XmlFeed &feed, XmlStreamHandler &handler, std::string &error) {
    error.clear();
    xmldetail::XmlErrorCapture capture;
    xmlSAXHandler sax;
    std::memset(&sax, 0, sizeof sax);
    sax.initialized = XML_SAX2_MAGIC;
    sax.startElementNs = onStart;
    sax.endElementNs = onEnd;
    sax.characters = onCharacters;
    sax.cdataBlock = onCharacters;
    sax.getEntity = onGetEntity;
    sax.internalSubset = onInternalSubset;
    sax.serror = onError;

    StreamParse p;
    p.handler = &handler;
    xmlParserCtxtPtr ctxt = xmlCreatePushParserCtxt(&sax, &p, nullptr, 0, "noname.xml");
    if (!ctxt) {
        error = "the XML parser could not be created";
        return XmlStreamStatus::OutOfMemory;
    }
    xmlCtxtUseOptions(ctxt, XML_PARSE_NONET);
    p.ctxt = ctxt;
    bool readError = false;
    std::string chunk;
    try {
        chunk.resize(256 * 1024);
    } catch (const std::bad_alloc &) {
        p.exception = true;
    }
    while (!p.exception) {
        long n = feed(chunk.data(), chunk.size());
        if (n < 0) {
            readError = true;
            break;
        }
        int rc = xmlParseChunk(ctxt, chunk.data(), int(n), n == 0 ? 1 : 0);
        if (rc != 0 || p.stopped || p.doctype || p.exception || ctxt->disableSAX) break;
        if (n == 0) break;
    }
    const bool wellFormed = ctxt->wellFormed != 0;
    p.ctxt = nullptr;
    if (ctxt->myDoc) {
        xmlFreeDoc(ctxt->myDoc);
        ctxt->myDoc = nullptr;
    }
    xmlFreeParserCtxt(ctxt);

    if (readError) return XmlStreamStatus::ReadError;
    if (p.exception) {
        error = "out of memory";
        return XmlStreamStatus::OutOfMemory;
    }
    if (p.doctype) {
        error = "document type declarations are not accepted";
        return XmlStreamStatus::Malformed;
    }
    if (p.stopped) return XmlStreamStatus::HandlerStopped;
    if (!wellFormed) {
        error = p.firstError.empty() ? capture.firstError() : p.firstError;
        if (error.empty()) error = "not well-formed";
        return XmlStreamStatus::Malformed;
    }
    return XmlStreamStatus::Ok;
}

XmlStreamStatus streamXmlMemory(std::string_view document, XmlStreamHandler &handler,
                                std::string &error) {
    size_t offset = 0;
    auto feed = [&](char *buffer, size_t capacity) -> long {
        size_t n = std::min(capacity, document.size() - offset);
        if (n) std::memcpy(buffer, document.data() + offset, n);
        offset += n;
        return long(n);
    };
    return streamXml(feed, handler, error);
}

// ---- writing -----------------------------------------------------------------------------------

namespace {

const xmlChar *X(const char *s) { return reinterpret_cast<const xmlChar *>(s); }

}  // namespace

struct XmlStreamWriter::Impl {
    std::unique_ptr<AtomicFile> file;
    std::FILE *stream = nullptr;
    std::string *text = nullptr;
    xmlTextWriterPtr writer = nullptr;
    int sinkError = 0;
    bool failed = false;
    bool finished = false;
    std::string error;
    std::string scratch;
    // Keeps the library's own error lines off the console while the document is written.
    std::optional<xmldetail::XmlErrorCapture> capture;

    ~Impl() {
        if (writer) xmlFreeTextWriter(writer);
    }

    static int write(void *context, const char *buffer, int len) {
        auto *self = static_cast<Impl *>(context);
        if (self->sinkError) return -1;
        if (self->text) {
            try {
                self->text->append(buffer, size_t(len));
            } catch (const std::bad_alloc &) {
                self->sinkError = ENOMEM;
                return -1;
            }
            return len;
        }
        if (std::fwrite(buffer, 1, size_t(len), self->stream) != size_t(len)) {
            self->sinkError = errno ? errno : EIO;
            return -1;
        }
        return len;
    }
    static int close(void *) { return 0; }

    bool fail(const std::string &why) {
        if (!failed) {
            failed = true;
            error = sinkError ? std::strerror(sinkError) : why;
        }
        return false;
    }
    bool check(int rc, const char *what) {
        if (failed) return false;
        if (rc < 0) return fail(what);
        return true;
    }
    bool start(const char *encoding) {
        capture.emplace();
        xmlOutputBufferPtr out = xmlOutputBufferCreateIO(write, close, this, nullptr);
        writer = out ? xmlNewTextWriter(out) : nullptr;
        if (!writer) {
            if (out) xmlOutputBufferClose(out);
            return fail("the XML writer could not be created");
        }
        return check(xmlTextWriterStartDocument(writer, nullptr, encoding, nullptr),
                     "the document could not be started") &&
               check(xmlTextWriterSetIndent(writer, 1), "the XML writer could not be set up") &&
               check(xmlTextWriterSetIndentString(writer, X("\t")),
                     "the XML writer could not be set up");
    }
};

XmlStreamWriter::XmlStreamWriter() : impl_(std::make_unique<Impl>()) {}
XmlStreamWriter::~XmlStreamWriter() = default;

bool XmlStreamWriter::openFile(const std::string &fileName, const char *encoding) {
    impl_->file = std::make_unique<AtomicFile>(fileName);
    impl_->stream = impl_->file->file();
    if (!impl_->stream) {
        impl_->sinkError = FileSystemUtilities::lastError();
        return impl_->fail("the file could not be created");
    }
    return impl_->start(encoding);
}

bool XmlStreamWriter::openString(std::string &out, const char *encoding) {
    out.clear();
    impl_->text = &out;
    return impl_->start(encoding);
}

bool XmlStreamWriter::startElement(const char *name) {
    return impl_->check(xmlTextWriterStartElement(impl_->writer, X(name)),
                        "an element could not be written");
}

bool XmlStreamWriter::endElement() {
    return impl_->check(xmlTextWriterEndElement(impl_->writer), "an element could not be written");
}

bool XmlStreamWriter::element(const char *name, std::string_view text) {
    if (impl_->failed) return false;
    impl_->scratch.assign(text);
    return impl_->check(
        xmlTextWriterWriteElement(impl_->writer, X(name), X(impl_->scratch.c_str())),
        "an element could not be written");
}

bool XmlStreamWriter::finish() {
    Impl &m = *impl_;
    if (m.finished) return !m.failed;
    m.finished = true;
    if (!m.writer) return m.fail("the document was never started");
    m.check(xmlTextWriterEndDocument(m.writer), "the document could not be ended");
    m.check(xmlTextWriterFlush(m.writer), "the document could not be flushed");
    xmlFreeTextWriter(m.writer);  // also frees the output buffer
    m.writer = nullptr;
    m.capture.reset();
    if (m.sinkError) m.fail("");
    if (m.failed || !m.file) return !m.failed;
    if (!m.file->commit()) {
        m.sinkError = FileSystemUtilities::lastError();
        return m.fail("the file could not be written");
    }
    return true;
}

const std::string &XmlStreamWriter::error() const { return impl_->error; }

// ---- text checks -------------------------------------------------------------------------------

bool isWritableXmlText(std::string_view s) {
    const auto *p = reinterpret_cast<const unsigned char *>(s.data());
    const auto *end = p + s.size();
    while (p < end) {
        unsigned c = *p;
        if (c < 0x80) {
            if (c < 0x20 && c != '\t' && c != '\n' && c != '\r') return false;
            ++p;
            continue;
        }
        int n = c >= 0xF0 ? 3 : c >= 0xE0 ? 2 : c >= 0xC2 ? 1 : -1;
        if (n < 0 || c > 0xF4 || end - p <= n) return false;
        uint32_t cp = c & (0x3F >> n);
        for (int i = 1; i <= n; ++i) {
            if ((p[i] & 0xC0) != 0x80) return false;
            cp = (cp << 6) | (p[i] & 0x3F);
        }
        static constexpr uint32_t kMin[] = {0, 0x80, 0x800, 0x10000};
        if (cp < kMin[n] || cp > 0x10FFFF || (cp >= 0xD800 && cp <= 0xDFFF) || cp == 0xFFFE ||
            cp == 0xFFFF)
            return false;
        p += n + 1;
    }
    return true;
}

bool isXmlElementName(std::string_view name) {
    if (name.empty()) return false;
    auto letter = [](char c) {
        return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || c == '_';
    };
    if (!letter(name[0])) return false;
    // "xml" in any case starts the names the XML standard reserves.
    if (name.size() >= 3 && (name[0] | 0x20) == 'x' && (name[1] | 0x20) == 'm' &&
        (name[2] | 0x20) == 'l')
        return false;
    for (char c : name)
        if (!letter(c) && !(c >= '0' && c <= '9') && c != '-' && c != '.') return false;
    return true;
}

}  // namespace ox
