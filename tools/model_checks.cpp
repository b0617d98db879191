#include "tools/model_checks.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <new>
#include <vector>

namespace ox {

namespace {

// Bytes of one PLY scalar type; 0 for a name that is none.
uint64_t plyTypeBytes(std::string_view type) {
    if (type == "char" || type == "uchar" || type == "int8" || type == "uint8") return 1;
    if (type == "short" || type == "ushort" || type == "int16" || type == "uint16") return 2;
    if (type == "int" || type == "uint" || type == "int32" || type == "uint32" || type == "float" ||
        type == "float32")
        return 4;
    if (type == "double" || type == "float64") return 8;
    return 0;
}

std::vector<std::string_view> words(std::string_view line) {
    std::vector<std::string_view> out;
    size_t pos = 0;
    while (true) {
        pos = line.find_first_not_of(" \t\r", pos);
        if (pos == std::string_view::npos) break;
        size_t end = line.find_first_of(" \t\r", pos);
        if (end == std::string_view::npos) end = line.size();
        out.push_back(line.substr(pos, end - pos));
        pos = end;
    }
    return out;
}

bool parseCount(std::string_view text, uint64_t &value) {
    if (text.empty() || text.size() > 19) return false;
    value = 0;
    for (char c : text) {
        if (c < '0' || c > '9') return false;
        value = value * 10 + uint64_t(c - '0');
    }
    return true;
}

// Every element needs at least one byte per instance (a line break in text files); each
// property needs its size in binary files and a digit and a separator in text files.
bool checkPly(std::string_view bytes, std::string &why) {
    // The header ends at the first line whose first word is end_header, as the library reads
    // it; the same word elsewhere on a line does not end it.
    size_t headerEnd = std::string_view::npos, bodyStart = std::string_view::npos;
    for (size_t at = 0; at < bytes.size();) {
        size_t end = bytes.find('\n', at);
        const std::vector<std::string_view> w =
            words(bytes.substr(at, end == std::string_view::npos ? std::string_view::npos
                                                                 : end - at));
        if (!w.empty() && w[0] == "end_header") {
            headerEnd = at;
            bodyStart = end;
            break;
        }
        if (end == std::string_view::npos) break;
        at = end + 1;
    }
    if (headerEnd == std::string_view::npos) {
        why = "the header has no end";
        return false;
    }
    const uint64_t body = bodyStart == std::string_view::npos ? 0 : bytes.size() - bodyStart - 1;
    std::string_view header = bytes.substr(0, headerEnd);
    bool binary = false;
    struct Element {
        std::string name;
        uint64_t count = 0;
        uint64_t minBytes = 0;
    };
    std::vector<Element> elements;
    size_t pos = 0;
    while (pos < header.size()) {
        size_t end = header.find('\n', pos);
        if (end == std::string_view::npos) end = header.size();
        const std::vector<std::string_view> w = words(header.substr(pos, end - pos));
        pos = end + 1;
        if (w.empty()) continue;
        // Only the header's own lines, with known types, are passed on: the library's reader
        // can loop without end on a property of a type it does not know.
        if (w[0] == "ply" || w[0] == "comment" || w[0] == "obj_info") continue;
        if (w[0] == "format") {
            if (w.size() < 2 || (w[1] != "ascii" && w[1] != "binary_little_endian" &&
                                 w[1] != "binary_big_endian")) {
                why = "the header names an unknown format";
                return false;
            }
            binary = w[1] != "ascii";
        } else if (w[0] == "element" && w.size() >= 3) {
            Element e;
            e.name = std::string(w[1].substr(0, 64));
            if (!parseCount(w[2], e.count)) {
                why = "the header declares a count of " + std::string(w[2].substr(0, 32)) +
                      " elements " + e.name;
                return false;
            }
            elements.push_back(std::move(e));
        } else if (w[0] == "property" && !elements.empty()) {
            Element &e = elements.back();
            const bool list = w.size() >= 2 && w[1] == "list";
            const uint64_t propertyBytes =
                list ? (w.size() >= 5 && plyTypeBytes(w[3]) > 0 ? plyTypeBytes(w[2]) : 0)
                     : (w.size() >= 3 ? plyTypeBytes(w[1]) : 0);
            if (propertyBytes == 0) {
                why = "the header holds a property of an unknown type in element " + e.name;
                return false;
            }
            e.minBytes += binary ? propertyBytes : 2;
            if (e.minBytes > 1 << 20) {
                why = "the header declares too many properties of element " + e.name;
                return false;
            }
        } else {
            why = "the header holds a line that is no header line";
            return false;
        }
    }
    uint64_t need = 0;
    for (const Element &e : elements) {
        // Counts are below 10^19 and sizes below 2^20: the product is checked before it is made.
        const uint64_t each = std::max<uint64_t>(e.minBytes, 1);
        if (e.count > body / each || need + e.count * each > body) {
            why = "the header declares " + std::to_string(e.count) + " elements " + e.name +
                  ", more than the file's " + std::to_string(body) + " bytes can hold";
            return false;
        }
        need += e.count * each;
    }
    return true;
}

uint32_t readU32(std::string_view bytes, size_t at) {
    uint32_t v = 0;
    for (int k = 3; k >= 0; --k) v = (v << 8) | static_cast<unsigned char>(bytes[at + size_t(k)]);
    return v;
}

bool checkGlb(std::string_view bytes, std::string &why) {
    if (bytes.size() < 12 || bytes.substr(0, 4) != "glTF") return true;  // the library reports it
    const uint64_t size = bytes.size();
    const uint32_t version = readU32(bytes, 4);
    const uint64_t length = readU32(bytes, 8);
    if (length > size) {
        why = "the binary header declares " + std::to_string(length) + " bytes, the file holds " +
              std::to_string(size);
        return false;
    }
    if (version == 1) {
        if (size < 20) return true;
        const uint64_t content = readU32(bytes, 12);
        if (content > size - 20) {
            why = "the binary header declares a content of " + std::to_string(content) +
                  " bytes, more than the file holds";
            return false;
        }
        return true;
    }
    uint64_t at = 12;
    for (int chunk = 0; at + 8 <= size; ++chunk) {
        const uint64_t chunkLength = readU32(bytes, size_t(at));
        if (chunkLength > size - at - 8) {
            why = "chunk " + std::to_string(chunk) + " declares " + std::to_string(chunkLength) +
                  " bytes, more than the file holds";
            return false;
        }
        at += 8 + chunkLength;
    }
    return true;
}

}  // namespace

bool checkDeclaredSizes(const std::string &extension, std::string_view bytes, std::string &why) {
    // The library takes any file that starts with these three letters for a PLY file; one that
    // does not is left to it to refuse.
    if (bytes.substr(0, 3) == "ply") return checkPly(bytes, why);
    if (extension == ".glb" || bytes.substr(0, 4) == "glTF") return checkGlb(bytes, why);
    return true;
}

bool readModelFile(const std::string &path, uint64_t maxBytes, std::string &out, std::string &why) {
    out.clear();
    // Opened without blocking, so that a named pipe is refused instead of waited on.
    const int fd = ::open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC | O_NOCTTY);
    if (fd < 0) {
        why = errno == ENOENT ? "no such file" : std::strerror(errno);
        return false;
    }
    struct stat st;
    if (::fstat(fd, &st) != 0 || !S_ISREG(st.st_mode)) {
        ::close(fd);
        why = "not a regular file";
        return false;
    }
    const int flags = ::fcntl(fd, F_GETFL);
    if (flags >= 0) ::fcntl(fd, F_SETFL, flags & ~O_NONBLOCK);
    const auto tooLarge = [&] {
        ::close(fd);
        out.clear();
        why = "larger than " + std::to_string(maxBytes >> 20) + " MiB";
        return false;
    };
    if (uint64_t(st.st_size) > maxBytes) return tooLarge();
    try {
        out.reserve(size_t(st.st_size));
        char chunk[1 << 16];
        for (;;) {
            const ssize_t n = ::read(fd, chunk, sizeof chunk);
            if (n < 0 && errno == EINTR) continue;
            if (n < 0) {
                why = std::strerror(errno);
                ::close(fd);
                out.clear();
                return false;
            }
            if (n == 0) break;
            if (out.size() + uint64_t(n) > maxBytes) return tooLarge();
            out.append(chunk, size_t(n));
        }
    } catch (const std::bad_alloc &) {
        ::close(fd);
        out.clear();
        why = "out of memory";
        return false;
    }
    ::close(fd);
    return true;
}

}  // namespace ox
