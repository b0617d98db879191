#include <libxml/entities.h>
#include <libxml/parser.h>
#include <libxml/parserInternals.h>
#include <libxml/tree.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <new>

#include "config/xml.h"
#include "config/xml_internal.h"
#include "core/message.h"

namespace ox {

using xmldetail::ReaderStyle;
using xmldetail::ValueReader;

/// The state of one streaming parse: depth 1 is the document element, depth 2 the objects.
struct XMLSAXDeserializer::Parse {
    XMLSAXDeserializer *owner = nullptr;
    xmlParserCtxtPtr ctxt = nullptr;
    int depth = 0;
    bool rootAccepted = false;
    const Handler *handler = nullptr;
    std::unique_ptr<OXCTypeBase> object;
    ValueReader reader{ReaderStyle::Stream};
    bool stopped = false;    // a handler refused an object
    bool exception = false;  // out of memory inside a callback
    std::string firstError;

    void stop() {
        if (ctxt) xmlStopParser(ctxt);
    }
};

namespace {

using Parse = XMLSAXDeserializer::Parse;

std::string_view nameOf(const xmlChar *n) { return reinterpret_cast<const char *>(n); }

void unknownNode(std::string_view name) {
    messageText(kMsgWarning, 1, "[XMLSAXParser] Unknown node: " + std::string(name));
}

}  // namespace

// The callbacks are members of a local struct so they may reach the private Parse type.
struct SaxCallbacks {
    static void startElement(void *ctx, const xmlChar *localname, const xmlChar *, const xmlChar *,
                             int, const xmlChar **, int, int, const xmlChar **) {
        auto *p = static_cast<Parse *>(ctx);
        try {
            ++p->depth;
            std::string_view name = nameOf(localname);
            if (p->depth == 1) {
                p->rootAccepted = name == "OXScene";
                if (!p->rootAccepted) unknownNode(name);
                return;
            }
            if (!p->rootAccepted) return;
            if (p->depth == 2) {
                auto it = p->owner->handlers_.find(std::string(name));
                if (it == p->owner->handlers_.end()) {
                    unknownNode(name);
                    return;
                }
                p->handler = &it->second;
                p->object = it->second.create();
                if (p->object) p->reader.begin(*p->object);
                return;
            }
            if (p->object) p->reader.startElement(name);
        } catch (const std::bad_alloc &) {
            p->exception = true;
            p->stop();
        }
    }

    static void endElement(void *ctx, const xmlChar *, const xmlChar *, const xmlChar *) {
        auto *p = static_cast<Parse *>(ctx);
        try {
            if (p->depth == 2 && p->object) {
                p->reader.endElement();
                if (!p->handler->finish(std::move(p->object))) {
                    p->stopped = true;
                    p->stop();
                }
                p->object.reset();
            } else if (p->depth > 2 && p->object) {
                p->reader.endElement();
            }
        } catch (const std::bad_alloc &) {
            p->exception = true;
            p->stop();
        }
        --p->depth;
    }

    static void characters(void *ctx, const xmlChar *text, int len) {
        auto *p = static_cast<Parse *>(ctx);
        if (p->depth < 3 || !p->object) return;
        try {
            p->reader.characters(
                std::string_view(reinterpret_cast<const char *>(text), size_t(len)));
        } catch (const std::bad_alloc &) {
            p->exception = true;
            p->stop();
        }
    }

    /// Only the five predefined entities exist: declared entities are never substituted.
    static xmlEntityPtr getEntity(void *, const xmlChar *name) {
        return xmlGetPredefinedEntity(name);
    }

    static void error(void *ctx, xmlErrorPtr err) {
        auto *p = static_cast<Parse *>(ctx);
        if (!err || !p->firstError.empty() || err->level < XML_ERR_ERROR) return;
        std::string text = err->message ? err->message : "unknown error";
        while (!text.empty() && (text.back() == '\n' || text.back() == '\r')) text.pop_back();
        p->firstError = "line " + std::to_string(err->line) + ": " + text;
    }
};

XMLSAXDeserializer::XMLSAXDeserializer() = default;
XMLSAXDeserializer::~XMLSAXDeserializer() = default;

void XMLSAXDeserializer::addHandler(std::string elementName, CreateFn create, FinishFn finish) {
    handlers_[std::move(elementName)] = Handler{std::move(create), std::move(finish)};
}

namespace {

/// Runs a push parse; `feed` supplies chunks (returns the bytes written, 0 at the end, -1 on a
/// read error).
bool runPushParse(Parse &p, const std::string &name,
                  const std::function<long(char *, size_t)> &feed) {
    xmldetail::XmlErrorCapture capture;
    xmlSAXHandler sax;
    std::memset(&sax, 0, sizeof sax);
    sax.initialized = XML_SAX2_MAGIC;
    sax.startElementNs = SaxCallbacks::startElement;
    sax.endElementNs = SaxCallbacks::endElement;
    sax.characters = SaxCallbacks::characters;
    sax.cdataBlock = SaxCallbacks::characters;
    sax.getEntity = SaxCallbacks::getEntity;
    sax.serror = SaxCallbacks::error;

    xmlParserCtxtPtr ctxt = xmlCreatePushParserCtxt(&sax, &p, nullptr, 0, name.c_str());
    if (!ctxt) {
        message(kMsgError, 1, "Error parsing file %s", name.c_str());
        return false;
    }
    xmlCtxtUseOptions(ctxt, XML_PARSE_NONET);
    p.ctxt = ctxt;
    bool readError = false;
    std::string chunk(256 * 1024, '\0');
    for (;;) {
        long n = feed(chunk.data(), chunk.size());
        if (n < 0) {
            readError = true;
            break;
        }
        int rc = xmlParseChunk(ctxt, chunk.data(), int(n), n == 0 ? 1 : 0);
        if (rc != 0 || p.stopped || p.exception || ctxt->disableSAX) break;
        if (n == 0) break;
    }
    bool wellFormed = ctxt->wellFormed != 0;
    p.ctxt = nullptr;
    // Entity declarations make the library keep a document of its own even in SAX mode.
    if (ctxt->myDoc) {
        xmlFreeDoc(ctxt->myDoc);
        ctxt->myDoc = nullptr;
    }
    xmlFreeParserCtxt(ctxt);

    if (readError) return false;  // reported by the feeder
    if (p.exception) {
        message(kMsgError, 1, "Out of memory while parsing %s", name.c_str());
        return false;
    }
    if (p.stopped) return false;  // the handler reported its own error
    if (!wellFormed) {
        std::string why = p.firstError.empty() ? capture.firstError() : p.firstError;
        message(kMsgError, 1, "Error parsing file %s: %s", name.c_str(),
                why.empty() ? "not well-formed" : why.c_str());
        return false;
    }
    return true;
}

}  // namespace

bool XMLSAXDeserializer::parseFile(const std::string &path) {
    uint64_t size = 0;
    int fd = xmldetail::openRegularFile(path, size);
    if (fd < 0) return false;
    uint64_t total = 0;
    auto feed = [&](char *buf, size_t cap) -> long {
        for (;;) {
            ssize_t n = ::read(fd, buf, cap);
            if (n < 0 && errno == EINTR) continue;
            if (n < 0) {
                message(kMsgError, 1, "Error reading file %s: %s", path.c_str(),
                        std::strerror(errno));
                return -1;
            }
            total += uint64_t(n);
            if (n == 0 && total != size) {
                message(kMsgError, 1, "Error reading file %s (%llu of %llu bytes read)",
                        path.c_str(), (unsigned long long)total, (unsigned long long)size);
                return -1;
            }
            return long(n);
        }
    };
    Parse p;
    p.owner = this;
    bool ok = runPushParse(p, path, feed);
    ::close(fd);
    return ok;
}

bool XMLSAXDeserializer::parseMemory(std::string_view document, const std::string &documentName) {
    size_t offset = 0;
    auto feed = [&](char *buf, size_t cap) -> long {
        size_t n = std::min(cap, document.size() - offset);
        std::memcpy(buf, document.data() + offset, n);
        offset += n;
        return long(n);
    };
    Parse p;
    p.owner = this;
    return runPushParse(p, documentName, feed);
}

}  // namespace ox
