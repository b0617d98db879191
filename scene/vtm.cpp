#include "scene/vtm.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <bit>
#include <cmath>
#include <cstring>

#include "core/message.h"

namespace vtm {
namespace {

static_assert(std::endian::native == std::endian::little,
              "temporary mesh files are little-endian; this build assumes a little-endian host");

constexpr size_t kBufferSize = 1 << 20;
constexpr char kMagic[4] = {'V', 'T', 'M', '\0'};

bool isCanonicalEmptyBox(const ox::BBox &b) { return b == ox::BBox::empty(); }

}  // namespace

VornTempMeshBase::~VornTempMeshBase() { close(); }

uint64_t VornTempMeshBase::triangleCount() const {
    uint64_t n = 0;
    for (const auto &g : groups_) n += g.triangleCount;  // at most 2^32 groups of < 2^32: no wrap
    return n;
}

bool VornTempMeshBase::fail(std::string why) {
    error_ = std::move(why);
    return false;
}

bool VornTempMeshBase::openRead(const std::string &path) {
    path_ = path;
    writing_ = false;
    // Opened without blocking, so that a named pipe or a device is refused instead of waiting
    // for a writer that never comes.
    const int fd = ::open(path.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC);
    if (fd < 0) return fail("cannot open the file");
    struct stat st;
    if (fstat(fd, &st) != 0 || !S_ISREG(st.st_mode)) {
        ::close(fd);
        return fail("not a regular file");
    }
    const int flags = fcntl(fd, F_GETFL);
    if (flags >= 0) fcntl(fd, F_SETFL, flags & ~O_NONBLOCK);
    file_ = fdopen(fd, "rb");
    if (!file_) {
        ::close(fd);
        return fail("cannot open the file");
    }
    fileSize_ = static_cast<uint64_t>(st.st_size);
    // A small file needs no more buffer than its own size.
    buffer_.resize(size_t(std::clamp<uint64_t>(fileSize_, 1, kBufferSize)));
    return true;
}

bool VornTempMeshBase::openWrite(const std::string &path) {
    path_ = path;
    writing_ = true;
    std::string templ = path + ".XXXXXX";
    int fd = mkstemp(templ.data());
    if (fd < 0) return fail("cannot create a temporary file beside " + path);
    fchmod(fd, 0644);
    file_ = fdopen(fd, "wb");
    if (!file_) {
        ::close(fd);
        ::unlink(templ.c_str());
        return fail("cannot open a temporary file beside " + path);
    }
    tempPath_ = templ;
    buffer_.resize(kBufferSize);
    return true;
}

void VornTempMeshBase::close() {
    if (file_) {
        std::fclose(file_);
        file_ = nullptr;
    }
    if (writing_ && !tempPath_.empty()) {
        ::unlink(tempPath_.c_str());
        tempPath_.clear();
    }
    buffer_.clear();
    buffer_.shrink_to_fit();
    bufPos_ = bufEnd_ = 0;
}

bool VornTempMeshBase::commit() {
    if (!writing_ || !file_) return fail("no file open for writing");
    bool ok = flushBuffer() && std::fflush(file_) == 0 && fsync(fileno(file_)) == 0;
    ok = (std::fclose(file_) == 0) && ok;
    file_ = nullptr;
    if (!ok) {
        close();
        return fail("cannot write " + path_);
    }
    if (std::rename(tempPath_.c_str(), path_.c_str()) != 0) {
        close();
        return fail("cannot rename the temporary file to " + path_);
    }
    tempPath_.clear();
    close();
    return true;
}

void VornTempMeshBase::takeOver(VornTempMeshBase &other) {
    close();
    path_ = std::move(other.path_);
    tempPath_ = std::move(other.tempPath_);
    file_ = other.file_;
    writing_ = other.writing_;
    fileSize_ = other.fileSize_;
    consumed_ = other.consumed_;
    buffer_ = std::move(other.buffer_);
    bufPos_ = other.bufPos_;
    bufEnd_ = other.bufEnd_;
    other.file_ = nullptr;
    other.tempPath_.clear();
    other.bufPos_ = other.bufEnd_ = 0;
}

uint64_t VornTempMeshBase::bytesLeft() const {
    return fileSize_ > consumed_ ? fileSize_ - consumed_ : 0;
}

bool VornTempMeshBase::fillBuffer() {
    if (!file_ || writing_) return false;
    bufPos_ = 0;
    // The first read is small: a pre-open needs only the header, and there may be thousands.
    const size_t want = consumed_ == 0 ? std::min<size_t>(16384, buffer_.size()) : buffer_.size();
    bufEnd_ = std::fread(buffer_.data(), 1, want, file_);
    return bufEnd_ > 0;
}

bool VornTempMeshBase::flushBuffer() {
    if (bufEnd_ == 0) return true;
    size_t n = std::fwrite(buffer_.data(), 1, bufEnd_, file_);
    bool ok = n == bufEnd_;
    bufEnd_ = 0;
    return ok;
}

bool VornTempMeshBase::readBytes(void *dst, size_t n) {
    auto *out = static_cast<unsigned char *>(dst);
    while (n > 0) {
        if (bufPos_ == bufEnd_ && !fillBuffer()) return fail("unexpected end of file");
        size_t take = std::min(n, bufEnd_ - bufPos_);
        std::memcpy(out, buffer_.data() + bufPos_, take);
        bufPos_ += take;
        consumed_ += take;
        out += take;
        n -= take;
    }
    return true;
}

bool VornTempMeshBase::writeBytes(const void *src, size_t n) {
    if (!file_ || !writing_) return fail("no file open for writing");
    auto *in = static_cast<const unsigned char *>(src);
    while (n > 0) {
        if (bufEnd_ == buffer_.size() && !flushBuffer()) return fail("cannot write " + path_);
        size_t take = std::min(n, buffer_.size() - bufEnd_);
        std::memcpy(buffer_.data() + bufEnd_, in, take);
        bufEnd_ += take;
        in += take;
        n -= take;
    }
    return true;
}

bool VornTempMeshBase::readU32(uint32_t &v) { return readBytes(&v, 4); }
bool VornTempMeshBase::writeU32(uint32_t v) { return writeBytes(&v, 4); }

bool VornTempMeshBase::readString(std::string &s) {
    s.clear();
    for (;;) {
        if (bufPos_ == bufEnd_ && !fillBuffer()) return fail("string without terminator");
        const unsigned char *start = buffer_.data() + bufPos_;
        size_t avail = bufEnd_ - bufPos_;
        const void *zero = std::memchr(start, 0, avail);
        size_t take =
            zero ? static_cast<size_t>(static_cast<const unsigned char *>(zero) - start) : avail;
        if (s.size() + take > kMaxStringLength) return fail("string longer than 4096 bytes");
        s.append(reinterpret_cast<const char *>(start), take);
        bufPos_ += take;
        consumed_ += take;
        if (zero) {
            ++bufPos_;
            ++consumed_;
            return true;
        }
    }
}

bool VornTempMeshBase::writeString(const std::string &s) {
    if (s.size() > kMaxStringLength || s.find('\0') != std::string::npos)
        return fail("string too long or with an embedded 0 byte: cannot be stored");
    return writeBytes(s.c_str(), s.size() + 1);
}

bool VornTempMeshBase::readHeader() {
    std::string s;
    if (!readString(shapeName_)) return false;
    if (!readU32(vertexCount_)) return false;
    uint32_t u = 0;
    if (!readU32(u)) return false;
    // Every name takes at least its terminator: a count beyond the bytes left is a lie.
    if (u > bytesLeft()) return fail("UV-set count larger than the file");
    uvSetNames_.clear();
    uvSetNames_.reserve(u);
    for (uint32_t i = 0; i < u; ++i) {
        if (!readString(s)) return false;
        uvSetNames_.push_back(s);
    }
    uint32_t g = 0;
    if (!readU32(g)) return false;
    if (uint64_t(g) * 5 > bytesLeft()) return fail("material-group count larger than the file");
    groups_.clear();
    groups_.reserve(g);
    for (uint32_t i = 0; i < g; ++i) {
        MaterialGroup grp;
        if (!readString(grp.name) || !readU32(grp.triangleCount)) return false;
        groups_.push_back(std::move(grp));
    }
    float box[6];
    if (!readBytes(box, sizeof box)) return false;
    bounds_ = ox::BBox({box[0], box[1], box[2]}, {box[3], box[4], box[5]});
    if (!bounds_.isValid() && !(isCanonicalEmptyBox(bounds_) && isEmpty()))
        return fail("bounding box is not finite or inverted");
    if (version() == 1) return checkBodySize(consumed_);
    return true;
}

bool VornTempMeshBase::checkBodySize(uint64_t headerEnd) {
    const uint64_t perVertex = uint64_t(vertexFloats()) * 4 + uint64_t(uvSetCount()) * 8;
    uint64_t vertexBytes = 0, triangleBytes = 0, total = 0;
    if (__builtin_mul_overflow(perVertex, uint64_t(vertexCount_), &vertexBytes) ||
        __builtin_mul_overflow(triangleCount(), uint64_t(12), &triangleBytes) ||
        __builtin_add_overflow(vertexBytes, triangleBytes, &total) ||
        __builtin_add_overflow(total, headerEnd, &total) || total > fileSize_) {
        return fail("file is shorter than its header says (" + std::to_string(fileSize_) +
                    " bytes)");
    }
    if (total < fileSize_) {
        ox::message(ox::kMsgWarning, 6,
                    "Temporary mesh file %s has %llu bytes after its last triangle; ignoring them",
                    path_.c_str(), static_cast<unsigned long long>(fileSize_ - total));
    }
    return true;
}

bool VornTempMeshBase::readVertex(float *fixed) { return readBytes(fixed, vertexFloats() * 4); }
bool VornTempMeshBase::readUV(float *uv) { return readBytes(uv, 8); }
bool VornTempMeshBase::readTriangle(uint32_t *indices) { return readBytes(indices, 12); }

bool VornTempMeshBase::writeHeader() {
    if (uvSetNames_.size() > UINT32_MAX || groups_.size() > UINT32_MAX)
        return fail("too many UV sets or material groups");
    if (!writeBytes(kMagic, 4) || !writeU32(version()) || !writeString(shapeName_) ||
        !writeU32(vertexCount_) || !writeU32(uvSetCount()))
        return false;
    for (const auto &n : uvSetNames_)
        if (!writeString(n)) return false;
    if (!writeU32(static_cast<uint32_t>(groups_.size()))) return false;
    for (const auto &g : groups_)
        if (!writeString(g.name) || !writeU32(g.triangleCount)) return false;
    float box[6] = {bounds_.min.x, bounds_.min.y, bounds_.min.z,
                    bounds_.max.x, bounds_.max.y, bounds_.max.z};
    return writeBytes(box, sizeof box);
}

bool VornTempMeshBase::writeVertex(const float *fixed) {
    return writeBytes(fixed, vertexFloats() * 4);
}
bool VornTempMeshBase::writeUV(const float *uv) { return writeBytes(uv, 8); }
bool VornTempMeshBase::writeTriangle(const uint32_t *indices) { return writeBytes(indices, 12); }
bool VornTempMeshBase::hasVertexColors() const { return false; }
void VornTempMeshBase::setVertexColors(bool) {}

bool VornTempMeshV2::readHeader() {
    if (!VornTempMeshBase::readHeader()) return false;
    uint32_t flag = 0;
    if (!readU32(flag)) return false;
    colors_ = flag != 0;
    return checkBodySize(consumedBytes());
}

bool VornTempMeshV2::writeHeader() {
    return VornTempMeshBase::writeHeader() && writeU32(colors_ ? 1u : 0u);
}

TempMeshReaderFactory &TempMeshReaderFactory::instance() {
    static TempMeshReaderFactory factory;
    return factory;
}

std::unique_ptr<VornTempMeshBase> TempMeshReaderFactory::open(const std::string &path,
                                                              OpenStatus *status,
                                                              std::string *error) const {
    auto result = [&](OpenStatus s, const std::string &why) {
        if (status) *status = s;
        if (error) *error = why;
        return std::unique_ptr<VornTempMeshBase>();
    };
    // The magic and version are read through a version-1 object, which owns the open file
    // until the right class takes over.
    VornTempMeshV1 probe;
    if (!probe.openRead(path)) return result(OpenStatus::kCannotOpen, probe.error());
    char magic[4];
    if (!probe.readBytes(magic, 4) || std::memcmp(magic, kMagic, 4) != 0)
        return result(OpenStatus::kBadMagic, "not a temporary mesh file (bad magic)");
    uint32_t version = 0;
    if (!probe.readU32(version)) return result(OpenStatus::kBadVersion, probe.error());
    std::unique_ptr<VornTempMeshBase> reader;
    if (version == 1)
        reader.reset(new VornTempMeshV1());
    else if (version == 2)
        reader.reset(new VornTempMeshV2());
    else
        return result(OpenStatus::kBadVersion,
                      "unsupported temporary mesh version " + std::to_string(version));
    reader->takeOver(probe);
    if (!reader->readHeader()) return result(OpenStatus::kBadHeader, reader->error());
    if (status) *status = OpenStatus::kOk;
    return reader;
}

std::unique_ptr<VornTempMeshBase> createWriter(const std::string &path, uint32_t version) {
    std::unique_ptr<VornTempMeshBase> w;
    if (version == 1)
        w.reset(new VornTempMeshV1());
    else if (version == 2)
        w.reset(new VornTempMeshV2());
    else
        return nullptr;
    if (!w->openWrite(path)) return nullptr;
    return w;
}

bool writeTempMesh(const std::string &path, const TempMesh &mesh, uint32_t version,
                   std::string *error) {
    auto setError = [&](const std::string &why) {
        if (error) *error = why;
        return false;
    };
    const uint32_t inFloats = mesh.colors ? 16 : 12;
    if (mesh.vertices.size() % inFloats != 0) return setError("vertex array has a partial record");
    const uint64_t v = mesh.vertices.size() / inFloats;
    const size_t u = mesh.uvSetNames.size();
    if (v > UINT32_MAX) return setError("too many vertices");
    if (mesh.uvs.size() != v * u * 2) return setError("UV array does not match the vertices");
    uint64_t tris = 0;
    for (const auto &g : mesh.groups) tris += g.triangleCount;
    if (mesh.indices.size() != tris * 3) return setError("index array does not match the groups");

    auto w = createWriter(path, version);
    if (!w) return setError("cannot create " + path);
    w->setShapeName(mesh.name);
    w->setVertexCount(static_cast<uint32_t>(v));
    w->setUvSetNames(mesh.uvSetNames);
    w->setGroups(mesh.groups);
    w->setBounds(mesh.bounds);
    w->setVertexColors(mesh.colors);
    if (!w->writeHeader()) return setError(w->error());
    float rec[16];
    const uint32_t outFloats = w->vertexFloats();
    for (uint64_t i = 0; i < v; ++i) {
        std::memcpy(rec, &mesh.vertices[i * inFloats], outFloats * sizeof(float));
        if (!w->writeVertex(rec)) return setError(w->error());
        for (size_t k = 0; k < u; ++k)
            if (!w->writeUV(&mesh.uvs[(i * u + k) * 2])) return setError(w->error());
    }
    for (size_t t = 0; t < mesh.indices.size(); t += 3)
        if (!w->writeTriangle(&mesh.indices[t])) return setError(w->error());
    if (!w->commit()) return setError(w->error());
    return true;
}

bool readTempMesh(const std::string &path, TempMesh &mesh, std::string *error) {
    std::string why;
    auto r = TempMeshReaderFactory::instance().open(path, nullptr, &why);
    if (!r) {
        if (error) *error = why;
        return false;
    }
    mesh = TempMesh();
    mesh.name = r->shapeName();
    mesh.uvSetNames = r->uvSetNames();
    mesh.groups = r->groups();
    mesh.bounds = r->bounds();
    mesh.colors = r->hasVertexColors();
    const uint32_t floats = r->vertexFloats(), u = r->uvSetCount(), v = r->vertexCount();
    // The header was checked against the file size, so these sizes are backed by real bytes.
    mesh.vertices.resize(size_t(v) * floats);
    mesh.uvs.resize(size_t(v) * u * 2);
    mesh.indices.resize(r->triangleCount() * 3);
    for (uint32_t i = 0; i < v; ++i) {
        bool ok = r->readVertex(&mesh.vertices[size_t(i) * floats]);
        for (uint32_t k = 0; ok && k < u; ++k) ok = r->readUV(&mesh.uvs[(size_t(i) * u + k) * 2]);
        if (!ok) {
            if (error) *error = r->error();
            return false;
        }
    }
    for (size_t t = 0; t < mesh.indices.size(); t += 3) {
        if (!r->readTriangle(&mesh.indices[t])) {
            if (error) *error = r->error();
            return false;
        }
    }
    return true;
}

}  // namespace vtm
