#pragma once

#include <cstdio>
#include <functional>
#include <memory>
#include <string>

namespace ox {

/// How a file is opened.
enum class FileAccess {
    kRead,    ///< read an existing file
    kWrite,   ///< create or truncate, then write
    kAppend,  ///< create if missing, write at the end
};

/// Closes a FILE when its owner goes away.
struct FileCloser {
    void operator()(std::FILE *f) const {
        if (f) std::fclose(f);
    }
};

/// An open C file, closed on destruction.
using FilePtr = std::unique_ptr<std::FILE, FileCloser>;

/// The process-wide file-access layer (POSIX). Every failing call leaves the platform error
/// code (errno) for lastError() on the calling thread; none of them prints a message.
class FileSystemUtilities {
public:
    /// True when path names an existing regular file (or other non-directory) that can be
    /// opened for reading.
    static bool canRead(const std::string &path);
    /// True when path exists (file or directory).
    static bool exists(const std::string &path);
    /// True when path is an existing directory.
    static bool isDirectory(const std::string &path);
    /// Creates the directory and every missing level above it ("a/b/c/", "a/b/c" and "./x"
    /// alike). True when the directory exists afterwards.
    static bool createDirectories(const std::string &path);
    /// Opens a file; binary and text mode are the same on this platform. Null on failure.
    static FilePtr open(const std::string &path, FileAccess access, bool binary = true);
    /// Reads a whole file into out, refusing files larger than maxBytes (EFBIG).
    static bool readFile(const std::string &path, std::string &out,
                         size_t maxBytes = size_t(1) << 30);
    /// Removes a file; true when it is gone afterwards.
    static bool removeFile(const std::string &path);
    /// The directory part of a path including its last "/" ("" for a bare name).
    static std::string directoryOf(const std::string &path);
    /// The platform error code of the calling thread's last failed call (0 = none recorded).
    static int lastError();
    /// Sets the calling thread's recorded error code (for layers that fail on their own).
    static void setLastError(int code);
};

/// Writes a file so that readers see either the old or the complete new contents: the data go
/// to a temporary file in the target's directory, which replaces the target by rename on
/// commit(). A file that is never committed is removed, and the target stays untouched.
class AtomicFile {
public:
    /// Prepares to replace path; nothing is created until tempPath() or file() is asked for.
    explicit AtomicFile(std::string path);
    /// Removes the temporary file unless commit() succeeded.
    ~AtomicFile();
    AtomicFile(const AtomicFile &) = delete;
    AtomicFile &operator=(const AtomicFile &) = delete;

    /// The final path.
    const std::string &path() const { return path_; }
    /// Creates (once) an empty temporary file beside the target and returns its name, for
    /// writers that want a file name (image and XML libraries). Empty on failure.
    const std::string &tempPath();
    /// The temporary file opened for binary writing (null on failure); owned by this object.
    std::FILE *file();
    /// Closes the temporary file, checks that every write reached it, and renames it over the
    /// target. False (with lastError set) when anything failed; the target is then unchanged.
    bool commit();

private:
    bool createTemp();

    std::string path_;
    std::string temp_;
    FilePtr file_;
    bool committed_ = false;
    bool failed_ = false;
};

/// Writes a file atomically from a callback that fills the open FILE; the callback returns
/// false to give up (the target then stays as it was).
bool writeFileAtomically(const std::string &path, const std::function<bool(std::FILE *)> &write);
/// Writes a file atomically with the given contents.
bool writeFileAtomically(const std::string &path, const std::string &contents);

}  // namespace ox
