#pragma once

#include <atomic>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "texture/image_reader.h"
#include "texture/texture.h"
#include "texture/texture_cache.h"

/// The texture manager: turns file names into shared, filtered textures.
///
/// Typical use (a spot light's gobo, an image-based light's probe, a material channel):
///
///     ox::TextureFactory &textures = ...;          // one per run
///     std::unique_ptr<ox::OXTexture> gobo = textures.getTexture(file, ox::kFilterEWA);
///     if (!gobo) { /* reported already; go on without it */ }
///     ox::Color c = gobo->lookup({u, v, dudx, dvdx, dudy, dvdy});
///
/// Each file (with its reader options) is read once, however many threads ask for it; all
/// lookup objects of a file share its loaded image, which lives as long as any of them.
namespace ox {

/// Settings of the texture manager.
struct TextureSettings {
    /// Directory of the texture cache; empty = the THEVORN_TEXTURE_CACHE environment variable,
    /// and with neither the cache is off.
    std::string cacheDirectory;
    /// Only read cache files, never write them.
    bool cacheReadOnly = false;
    /// Largest level-0 image in bytes (width x height x channels x bytes per channel).
    uint64_t maxImageBytes = kDefaultMaxImageBytes;
};

class TextureFactory {
public:
    explicit TextureFactory(TextureSettings settings = {});

    /// Adds a reader for an extension ("Image reader for extension %s already registered" when
    /// it is taken).
    bool registerReader(const std::string &extension, std::shared_ptr<IRFactory> factory);
    /// The lookup object of a filter mode (TextureFilterMode; others give MipMapTexture) over the
    /// image of a file, loading it on first use. Null (after one message) when the file cannot
    /// be read; a failed file is not tried again.
    std::unique_ptr<OXTexture> getTexture(const std::string &fileName, int filterMode,
                                          const ReaderOptions &options = {});
    /// The loaded image of a file (loading it on first use); null when it cannot be read.
    std::shared_ptr<const MipImage> getImage(const std::string &fileName,
                                             const ReaderOptions &options = {});

    /// How many files were decoded from their source (not from the cache).
    uint64_t sourceReads() const { return sourceReads_.load(); }
    /// How many images came from the texture cache.
    uint64_t cacheReads() const { return cacheReads_.load(); }
    /// The texture cache, or null when it is off.
    const TextureCache *cache() const { return cache_.get(); }
    /// The reader registry.
    const ReaderRegistry &registry() const { return registry_; }

private:
    struct Entry {
        std::mutex mutex;  // held while the file loads, so that it loads once
        bool done = false;
        std::shared_ptr<const MipImage> image;
    };

    std::shared_ptr<const MipImage> load(const std::string &fileName, const ReaderOptions &options);

    TextureSettings settings_;
    std::mutex mutex_;  // guards registry_ and entries_
    ReaderRegistry registry_;
    std::map<std::string, std::shared_ptr<Entry>> entries_;
    std::unique_ptr<TextureCache> cache_;
    std::atomic<uint64_t> sourceReads_{0}, cacheReads_{0};
};

}  // namespace ox
