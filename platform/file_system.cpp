#include "platform/file_system.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>

namespace ox {
namespace {

thread_local int tLastError = 0;

bool fail(int code) {
    tLastError = code != 0 ? code : EIO;
    return false;
}

const char *modeString(FileAccess access) {
    switch (access) {
        case FileAccess::kRead:
            return "rb";
        case FileAccess::kWrite:
            return "wb";
        case FileAccess::kAppend:
            return "ab";
    }
    return "rb";
}

}  // namespace

int FileSystemUtilities::lastError() { return tLastError; }

void FileSystemUtilities::setLastError(int code) { tLastError = code; }

bool FileSystemUtilities::canRead(const std::string &path) {
    if (path.empty()) return fail(ENOENT);
    // Non-blocking, so that asking about a pipe never waits for a writer.
    const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
    if (fd < 0) return fail(errno);
    struct stat st {};
    const bool statOk = ::fstat(fd, &st) == 0;
    const int statError = errno;
    ::close(fd);
    if (!statOk) return fail(statError);
    if (S_ISDIR(st.st_mode)) return fail(EISDIR);
    return true;
}

bool FileSystemUtilities::exists(const std::string &path) {
    struct stat st {};
    if (path.empty()) return fail(ENOENT);
    if (::stat(path.c_str(), &st) != 0) return fail(errno);
    return true;
}

bool FileSystemUtilities::isDirectory(const std::string &path) {
    struct stat st {};
    if (path.empty()) return fail(ENOENT);
    if (::stat(path.c_str(), &st) != 0) return fail(errno);
    if (!S_ISDIR(st.st_mode)) return fail(ENOTDIR);
    return true;
}

bool FileSystemUtilities::createDirectories(const std::string &path) {
    if (path.empty()) return fail(ENOENT);
    // Walk the levels from the top: each prefix ending before a "/" is one level.
    for (size_t pos = 1; pos <= path.size(); ++pos) {
        if (pos < path.size() && path[pos] != '/') continue;
        const std::string level = path.substr(0, pos);
        if (level.back() == '/' || level == "." || level == "..") continue;
        if (::mkdir(level.c_str(), 0777) == 0) continue;
        const int code = errno;
        if (code != EEXIST) return fail(code);
        if (!isDirectory(level)) return fail(ENOTDIR);
    }
    return true;
}

FilePtr FileSystemUtilities::open(const std::string &path, FileAccess access, bool binary) {
    (void)binary;  // POSIX makes no difference between text and binary files.
    if (path.empty()) {
        fail(ENOENT);
        return nullptr;
    }
    FilePtr f(std::fopen(path.c_str(), modeString(access)));
    if (!f) fail(errno);
    return f;
}

bool FileSystemUtilities::readFile(const std::string &path, std::string &out, size_t maxBytes) {
    out.clear();
    FilePtr f = open(path, FileAccess::kRead);
    if (!f) return false;
    struct stat st {};
    if (::fstat(::fileno(f.get()), &st) != 0) return fail(errno);
    if (S_ISDIR(st.st_mode)) return fail(EISDIR);
    if (st.st_size < 0 || static_cast<uint64_t>(st.st_size) > maxBytes) return fail(EFBIG);
    out.resize(static_cast<size_t>(st.st_size));
    const size_t got = out.empty() ? 0 : std::fread(out.data(), 1, out.size(), f.get());
    if (got != out.size()) {
        out.clear();
        return fail(std::ferror(f.get()) ? errno : EIO);
    }
    return true;
}

bool FileSystemUtilities::removeFile(const std::string &path) {
    if (::unlink(path.c_str()) == 0 || errno == ENOENT) return true;
    return fail(errno);
}

std::string FileSystemUtilities::directoryOf(const std::string &path) {
    const size_t slash = path.rfind('/');
    return slash == std::string::npos ? std::string() : path.substr(0, slash + 1);
}

AtomicFile::AtomicFile(std::string path) : path_(std::move(path)) {}

AtomicFile::~AtomicFile() {
    file_.reset();
    if (!committed_ && !temp_.empty()) ::unlink(temp_.c_str());
}

bool AtomicFile::createTemp() {
    if (!temp_.empty()) return true;
    if (failed_) return false;
    if (path_.empty() || path_.back() == '/') {
        failed_ = true;
        return fail(EISDIR);
    }
    static std::atomic<unsigned> counter{0};
    const std::string dir = FileSystemUtilities::directoryOf(path_);
    // A long base name is shortened so that the temporary name stays within the name limit.
    const std::string base = path_.substr(dir.size()).substr(0, 180);
    for (int attempt = 0; attempt < 100; ++attempt) {
        const std::string name = dir + "." + base + ".tmp" + std::to_string(::getpid()) + "_" +
                                 std::to_string(counter.fetch_add(1));
        const int fd = ::open(name.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0666);
        if (fd >= 0) {
            ::close(fd);
            temp_ = name;
            return true;
        }
        if (errno != EEXIST) {
            failed_ = true;
            return fail(errno);
        }
    }
    failed_ = true;
    return fail(EEXIST);
}

const std::string &AtomicFile::tempPath() {
    static const std::string kNone;
    return createTemp() ? temp_ : kNone;
}

std::FILE *AtomicFile::file() {
    if (file_) return file_.get();
    if (!createTemp()) return nullptr;
    file_.reset(std::fopen(temp_.c_str(), "wb"));
    if (!file_) {
        failed_ = true;
        fail(errno);
    }
    return file_.get();
}

bool AtomicFile::commit() {
    if (committed_) return true;
    if (!createTemp()) return false;
    if (file_) {
        std::FILE *f = file_.release();
        bool ok = std::fflush(f) == 0 && !std::ferror(f);
        int code = ok ? 0 : errno;
        // The data reach the disk before the name does, so a crash never leaves a torn file.
        // A file system that cannot sync (EINVAL, EROFS) has nothing more to write out.
        if (ok && ::fsync(::fileno(f)) != 0 && errno != EINVAL && errno != EROFS) {
            ok = false;
            code = errno;
        }
        if (std::fclose(f) != 0 && ok) {
            ok = false;
            code = errno;
        }
        if (!ok) {
            failed_ = true;
            return fail(code);
        }
    }
    if (failed_) return fail(EIO);
    if (::rename(temp_.c_str(), path_.c_str()) != 0) return fail(errno);
    committed_ = true;
    return true;
}

bool writeFileAtomically(const std::string &path, const std::function<bool(std::FILE *)> &write) {
    AtomicFile out(path);
    std::FILE *f = out.file();
    if (!f) return false;
    if (!write(f)) {
        if (FileSystemUtilities::lastError() == 0) FileSystemUtilities::setLastError(EIO);
        return false;
    }
    return out.commit();
}

bool writeFileAtomically(const std::string &path, const std::string &contents) {
    return writeFileAtomically(path, [&contents](std::FILE *f) {
        if (contents.empty()) return true;
        if (std::fwrite(contents.data(), 1, contents.size(), f) == contents.size()) return true;
        FileSystemUtilities::setLastError(errno != 0 ? errno : EIO);
        return false;
    });
}

}  // namespace ox
