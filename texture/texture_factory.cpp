#include "texture/texture_factory.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "core/message.h"
#include "platform/file_system.h"

namespace ox {

TextureFactory::TextureFactory(TextureSettings settings) : settings_(std::move(settings)) {
    std::string dir = settings_.cacheDirectory;
    if (dir.empty())
        if (const char *env = std::getenv(kTextureCacheEnvironment)) dir = env;
    if (!dir.empty()) cache_ = std::make_unique<TextureCache>(dir, settings_.cacheReadOnly);
}

bool TextureFactory::registerReader(const std::string &extension,
                                    std::shared_ptr<IRFactory> factory) {
    std::lock_guard<std::mutex> lock(mutex_);
    return registry_.registerReader(extension, std::move(factory));
}

std::unique_ptr<OXTexture> TextureFactory::getTexture(const std::string &fileName, int filterMode,
                                                      const ReaderOptions &options) {
    std::shared_ptr<const MipImage> image = getImage(fileName, options);
    if (!image) return nullptr;
    return makeTexture(std::move(image), filterMode);
}

std::shared_ptr<const MipImage> TextureFactory::getImage(const std::string &fileName,
                                                         const ReaderOptions &options) {
    std::shared_ptr<Entry> entry;
    {
        std::lock_guard<std::mutex> lock(mutex_);
        std::shared_ptr<Entry> &slot = entries_[fileName + '\n' + options.key()];
        if (!slot) slot = std::make_shared<Entry>();
        entry = slot;
    }
    // Other files keep loading on other threads; a second request for this one waits here.
    std::lock_guard<std::mutex> lock(entry->mutex);
    if (!entry->done) {
        entry->image = load(fileName, options);
        entry->done = true;
    }
    return entry->image;
}

std::shared_ptr<const MipImage> TextureFactory::load(const std::string &fileName,
                                                     const ReaderOptions &options) {
    auto image = std::make_shared<MipImage>();
    if (cache_) {
        switch (cache_->load(fileName, options, *image, settings_.maxImageBytes)) {
            case TextureCache::Result::kLoaded:
                message(kMsgVerbose, 3, "Using cached version of %s (%s)", fileName.c_str(),
                        cache_->cacheFileName(fileName, options).c_str());
                ++cacheReads_;
                return image;
            case TextureCache::Result::kDamaged:
                if (!cache_->readOnly())
                    message(kMsgWarning, 3, "Failed to load cached texture for file %s",
                            fileName.c_str());
                [[fallthrough]];
            case TextureCache::Result::kMissing:
                if (cache_->readOnly())
                    message(kMsgWarning, 3,
                            "Read only cache can't find/use texture for file %s, falling back",
                            fileName.c_str());
                break;
        }
    }

    const std::string ext = textureExtension(fileName);
    const IRFactory *factory;
    {
        std::lock_guard<std::mutex> lock(mutex_);
        factory = registry_.find(ext);
    }
    if (!factory) {
        message(kMsgError, 3, "No image reader for extension %s registered", ext.c_str());
        return nullptr;
    }
    std::string bytes;
    // A file is not much larger than the largest image it may hold; the slack is for headers,
    // thumbnails and metadata.
    const uint64_t maxFileBytes = settings_.maxImageBytes + (uint64_t(1) << 20);
    if (!FileSystemUtilities::readFile(fileName, bytes,
                                       size_t(std::min<uint64_t>(maxFileBytes, SIZE_MAX)))) {
        const int err = FileSystemUtilities::lastError();
        message(kMsgError, 3, "Error opening texture %s (%s)", fileName.c_str(),
                err ? std::strerror(err) : "cannot read the file");
        return nullptr;
    }
    ++sourceReads_;
    std::unique_ptr<ImageReader> reader = factory->create();
    const auto *data = reinterpret_cast<const uint8_t *>(bytes.data());
    if (!reader->open(fileName, data, bytes.size(), options)) return nullptr;
    const ImageInfo info = reader->info();  // a copy: the reader goes before the image is built
    message(kMsgDebug, 3, "Creating texture from %s with %dx%d, %d bpc, %s and %s",
            fileName.c_str(), info.width, info.height, info.bitsPerChannel,
            info.grey ? "grayscale" : "color", info.alpha ? "alpha" : "no alpha");
    TexelFormat format;
    if (!TexelFormat::fromBits(info.bitsPerChannel, info.isFloat,
                               (info.grey ? 1 : 3) + (info.alpha ? 1 : 0), format)) {
        message(kMsgWarning, 3,
                "Could not create appropriate texelbuffer for %d, %d. Defaulting to 8, 4",
                info.bitsPerChannel, (info.grey ? 1 : 3) + (info.alpha ? 1 : 0));
        format = {TexelType::kU8, 4};
    }
    ReadLimits limits;
    limits.maxImageBytes = settings_.maxImageBytes;
    TexelBuffer level0;
    if (!reader->readPixels(level0, limits)) return nullptr;
    bytes = std::string();  // the encoded file is no longer needed
    reader.reset();
    // The reader decodes in its own layout; the level gets the layout chosen above, by
    // conversion when the two differ, never by writing one layout into another's buffer.
    if (!(level0.format() == format)) {
        TexelBuffer converted;
        if (!level0.convertTo(fileName, format, converted, settings_.maxImageBytes)) return nullptr;
        level0 = std::move(converted);
    }
    if (!image->build(fileName, std::move(level0), info.bitsPerChannel > 8, info.bitsPerChannel,
                      settings_.maxImageBytes))
        return nullptr;
    if (cache_ && !cache_->readOnly()) {
        message(kMsgVerbose, 3, "Trying to cache %s", fileName.c_str());
        if (cache_->store(fileName, options, *image))
            message(kMsgVerbose, 3, "Successfully cached %s (%s)", fileName.c_str(),
                    cache_->cacheFileName(fileName, options).c_str());
    }
    return image;
}

}  // namespace ox
