#pragma once

#include <unistd.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>

#include "core/message.h"

/// Helpers shared by the fuzz targets.
namespace oxfuzz {

/// Turns every message type off: the readers' reports are not what a fuzzer looks at.
inline void quietMessages() { ox::setTypeEnabled(0xFFFFFFFFu, false); }

/// A file of this process in the temporary directory, for readers that only read files. The
/// file is rewritten for every input and removed when the process ends.
class ScratchFile {
public:
    explicit ScratchFile(const char *suffix) {
        const char *dir = std::getenv("TMPDIR");
        path_ = std::string(dir && *dir ? dir : "/tmp") + "/oxfuzz_" + std::to_string(::getpid()) +
                suffix;
    }
    ~ScratchFile() { ::unlink(path_.c_str()); }
    /// Replaces the file's contents; false when it cannot be written.
    bool write(const uint8_t *data, size_t size) {
        std::FILE *f = std::fopen(path_.c_str(), "wb");
        if (!f) return false;
        const bool ok = std::fwrite(data, 1, size, f) == size;
        return std::fclose(f) == 0 && ok;
    }
    const std::string &path() const { return path_; }

private:
    std::string path_;
};

}  // namespace oxfuzz
