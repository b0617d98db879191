#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <new>

#include "core/message.h"
#include "platform/file_system.h"
#include "pointcloud/point_cloud_internal.h"
#include "pointcloud/point_cloud_io.h"

namespace ox {

using pcdetail::RawHeader;
using pcdetail::RawVariable;

namespace {

/// Bytes of the fixed header before the variable definitions, and of one definition.
constexpr uint64_t kFixedHeaderBytes = 176;
constexpr uint64_t kDefinitionBytes = 40;

/// Sequential reading from a file descriptor or a memory block, with the bytes left known.
class ByteInput {
public:
    explicit ByteInput(std::string_view memory) : memory_(memory), remaining_(memory.size()) {}
    ByteInput(int fd, uint64_t size) : fd_(fd), remaining_(size) {}

    uint64_t remaining() const { return remaining_; }
    /// False when fewer than n bytes are left or the file cannot be read.
    bool read(void *dst, uint64_t n) {
        if (n > remaining_) return false;
        if (fd_ < 0) {
            if (n) std::memcpy(dst, memory_.data() + offset_, size_t(n));
        } else {
            auto *p = static_cast<char *>(dst);
            uint64_t done = 0;
            while (done < n) {
                // Large reads go in pieces the kernel accepts in one call.
                size_t want = size_t(std::min<uint64_t>(n - done, uint64_t(1) << 30));
                ssize_t got = ::read(fd_, p + done, want);
                if (got < 0 && errno == EINTR) continue;
                if (got <= 0) {
                    error_ = got < 0 ? errno : 0;
                    remaining_ = 0;  // a file that shrank or failed has nothing more to give
                    return false;
                }
                done += uint64_t(got);
            }
        }
        offset_ += n;
        remaining_ -= n;
        return true;
    }
    /// The system error of a failed read (0 for a file that ended early).
    int error() const { return error_; }

private:
    std::string_view memory_;
    int fd_ = -1;
    uint64_t offset_ = 0;
    uint64_t remaining_ = 0;
    int error_ = 0;
};

uint32_t u32At(const uint8_t *p) {
    uint32_t v;
    std::memcpy(&v, p, 4);
    return v;
}
float f32At(const uint8_t *p) {
    float v;
    std::memcpy(&v, p, 4);
    return v;
}
/// A 32-byte text field: up to the first zero byte, at most 32 bytes.
std::string textAt(const uint8_t *p) {
    size_t n = 0;
    while (n < kPointCloudNameBytes && p[n]) ++n;
    return std::string(reinterpret_cast<const char *>(p), n);
}

bool readHeader(ByteInput &in, RawHeader &raw) {
    uint8_t fixed[kFixedHeaderBytes];
    if (!in.read(fixed, sizeof fixed)) return false;
    const uint8_t *p = fixed;
    raw.fields = pcdetail::readDefaults();
    raw.fields.version = u32At(p), p += 4;
    raw.fields.description = textAt(p), p += 32;
    raw.fields.type = textAt(p), p += 32;
    raw.fields.typeId = u32At(p), p += 4;
    raw.fields.compression = u32At(p), p += 4;
    for (int k = 0; k < 3; ++k) raw.fields.boundsMin[k] = f32At(p), p += 4;
    for (int k = 0; k < 3; ++k) raw.fields.boundsMax[k] = f32At(p), p += 4;
    for (int r = 0; r < 4; ++r)
        for (int c = 0; c < 4; ++c) raw.fields.objectToWorld.m[r][c] = f32At(p), p += 4;
    raw.numPoints = u32At(p), p += 4;
    raw.pointSize = u32At(p), p += 4;
    const uint32_t numVariables = u32At(p);
    // The definitions must fit in what the file holds before anything is allocated for them.
    if (uint64_t(numVariables) * kDefinitionBytes > in.remaining()) return false;
    raw.variables.resize(numVariables);
    for (RawVariable &v : raw.variables) {
        uint8_t def[kDefinitionBytes];
        if (!in.read(def, sizeof def)) return false;
        v.name = textAt(def);
        v.size = u32At(def + 32);
        v.count = u32At(def + 36);
    }
    return true;
}

void putU32(std::string &out, uint32_t v) { out.append(reinterpret_cast<const char *>(&v), 4); }
void putF32(std::string &out, float v) { out.append(reinterpret_cast<const char *>(&v), 4); }
void putText(std::string &out, const std::string &text) {
    char field[kPointCloudNameBytes] = {};
    std::memcpy(field, text.data(), std::min<size_t>(text.size(), kPointCloudNameBytes - 1));
    out.append(field, sizeof field);
}

/// The name as a 32-byte field holds it; warns when it had to be cut.
std::string cutName(const std::string &name, const char *what) {
    std::string cut = pcdetail::fieldName(name);
    if (cut.size() != name.size())
        message(kMsgWarning, 1, "The %s \"%s\" is longer than %u bytes and is written as \"%s\"",
                what, name.c_str(), kPointCloudNameBytes - 1, cut.c_str());
    return cut;
}

}  // namespace

bool PointCloudBinaryReader::process(PointCloud &cloud) {
    const std::string &name = source_.name;
    int fd = -1;
    uint64_t fileSize = source_.memory.size();
    if (!source_.fromMemory) {
        fd = pcdetail::openForReading(name, fileSize);
        if (fd < 0) return false;
    }
    struct Closer {
        int fd;
        ~Closer() {
            if (fd >= 0) ::close(fd);
        }
    } closer{fd};
    ByteInput in = source_.fromMemory ? ByteInput(source_.memory) : ByteInput(fd, fileSize);

    RawHeader raw;
    bool headerRead;
    try {
        headerRead = readHeader(in, raw);
    } catch (const std::bad_alloc &) {
        headerRead = false;
    }
    if (!headerRead) {
        if (in.error())
            message(kMsgError, 1, "Could not read file %s: %s", name.c_str(),
                    std::strerror(in.error()));
        message(kMsgError, 1, "Could not read header in file %s!", name.c_str());
        return false;
    }
    std::vector<PointVariable> variables;
    if (!pcdetail::checkHeader(raw, name, true, expected_, variables)) return false;

    const uint64_t dataBytes = uint64_t(raw.numPoints) * raw.pointSize;  // < 2^64
    if (dataBytes > in.remaining()) {
        message(kMsgError, 1, "Unexpected end of file in %s!", name.c_str());
        return false;
    }
    if (dataBytes < in.remaining()) {
        message(kMsgError, 1,
                "File %s is larger than its header says (%llu bytes of point data expected, %llu "
                "found)",
                name.c_str(), (unsigned long long)dataBytes, (unsigned long long)in.remaining());
        return false;
    }

    PointCloud result;
    result.header() = raw.fields;
    result.setVariables(std::move(variables));
    try {
        result.mutableBytes().resize(size_t(dataBytes));
    } catch (const std::exception &) {
        message(kMsgError, 1, "Out of memory reading %s (%llu bytes of point data)", name.c_str(),
                (unsigned long long)dataBytes);
        return false;
    }
    if (!in.read(result.mutableBytes().data(), dataBytes)) {
        if (in.error())
            message(kMsgError, 1, "Could not read file %s: %s", name.c_str(),
                    std::strerror(in.error()));
        message(kMsgError, 1, "Unexpected end of file in %s!", name.c_str());
        return false;
    }
    cloud = std::move(result);
    return true;
}

bool PointCloudBinaryWriter::write(const PointCloud &cloud) {
    const std::string &name = target_.name;
    const PointCloudHeader &h = cloud.header();
    const uint64_t numPoints = cloud.size();
    if (numPoints > UINT32_MAX) {
        message(kMsgError, 1, "Could not write file %s: %llu points are more than a file can hold",
                name.c_str(), (unsigned long long)numPoints);
        return false;
    }

    std::string head;
    head.reserve(kFixedHeaderBytes + kDefinitionBytes * cloud.variables().size());
    putU32(head, kPointCloudVersion);  // the layout written is always this version's
    putText(head, cutName(h.description, "description"));
    putText(head, cutName(h.type, "type name"));
    putU32(head, h.typeId);
    putU32(head, h.compression);
    for (int k = 0; k < 3; ++k) putF32(head, h.boundsMin[k]);
    for (int k = 0; k < 3; ++k) putF32(head, h.boundsMax[k]);
    for (int r = 0; r < 4; ++r)
        for (int c = 0; c < 4; ++c) putF32(head, h.objectToWorld.m[r][c]);
    putU32(head, uint32_t(numPoints));
    putU32(head, uint32_t(cloud.pointSize()));
    putU32(head, uint32_t(cloud.variables().size()));
    std::vector<std::string> written;
    uint64_t variableBytes = 0;
    for (const PointVariable &v : cloud.variables()) {
        std::string field = cutName(v.name, "variable name");
        for (const std::string &other : written)
            if (other == field) {
                message(kMsgError, 1,
                        "Could not write file %s: two variables are both named \"%s\" in the "
                        "file",
                        name.c_str(), field.c_str());
                return false;
            }
        putText(head, field);
        putU32(head, v.elementSize());
        putU32(head, v.count);
        written.push_back(std::move(field));
        variableBytes += v.bytes();
    }

    const uint64_t expected = numPoints * variableBytes;
    const uint64_t dataBytes = cloud.bytes().size();
    if (target_.text) {
        try {
            target_.text->assign(head);
            target_.text->append(reinterpret_cast<const char *>(cloud.bytes().data()),
                                 size_t(dataBytes));
        } catch (const std::bad_alloc &) {
            message(kMsgError, 1, "Out of memory writing %s", name.c_str());
            return false;
        }
    } else {
        AtomicFile out(name);
        std::FILE *f = out.file();
        if (!f) {
            message(kMsgError, 1, "Could not open file %s for writing!", name.c_str());
            return false;
        }
        bool ok = std::fwrite(head.data(), 1, head.size(), f) == head.size() &&
                  (dataBytes == 0 ||
                   std::fwrite(cloud.bytes().data(), 1, size_t(dataBytes), f) == size_t(dataBytes));
        int err = ok ? 0 : errno;
        if (ok && !out.commit()) {
            ok = false;
            err = FileSystemUtilities::lastError();
        }
        if (!ok) {
            message(kMsgError, 1, "Could not write file %s: %s", name.c_str(),
                    std::strerror(err ? err : EIO));
            return false;
        }
    }
    if (dataBytes != expected)
        message(kMsgWarning, 1,
                "Point cloud data size mismatch. Total point cloud data is %llu bytes, but %llu "
                "bytes where written to file",
                (unsigned long long)expected, (unsigned long long)dataBytes);
    return true;
}

}  // namespace ox
