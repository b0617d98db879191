#pragma once

#include <string>

#include "texture/image_reader.h"
#include "texture/mip_map.h"

/// The texture cache: converted copies of texture files, with their mip levels, as tiled
/// OpenEXR files in one directory, so that later runs skip decoding and filtering.
namespace ox {

/// Version stored in "TCVersion"; a cache file of another version is rebuilt.
constexpr int kTextureCacheVersion = 1;
/// Environment variable that names the cache directory when no setting does.
constexpr const char *kTextureCacheEnvironment = "THEVORN_TEXTURE_CACHE";

/// One cache directory. A cache file is named from a hash of the source's absolute path and
/// reader options and holds the source's size and modification time; it is current when both
/// still match the source.
class TextureCache {
public:
    /// What load() found.
    enum class Result {
        kMissing,  ///< no cache file, or one that is no longer current (no message)
        kLoaded,   ///< the image came from the cache
        kDamaged,  ///< a cache file that could not be used (reported)
    };

    /// A cache in `directory`; readOnly caches are never written.
    TextureCache(std::string directory, bool readOnly);

    const std::string &directory() const { return directory_; }
    bool readOnly() const { return readOnly_; }
    /// The cache file of a source (directory + 16 hex digits + ".exr").
    std::string cacheFileName(const std::string &source, const ReaderOptions &options) const;
    /// Loads a current copy of the source into image.
    Result load(const std::string &source, const ReaderOptions &options, MipImage &image,
                uint64_t maxBytes) const;
    /// Writes the image as the cache file of the source through a temporary file that is then
    /// renamed, so that readers never see half a file. False after one warning.
    bool store(const std::string &source, const ReaderOptions &options,
               const MipImage &image) const;

private:
    std::string directory_;
    bool readOnly_;
};

}  // namespace ox
