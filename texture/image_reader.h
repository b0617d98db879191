#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>

#include "texture/texel_buffer.h"

/// Image readers: one reader class per file format, made by a factory registered under the
/// lower-case file extensions it reads. Every reader decodes from bytes in memory.
namespace ox {

/// Options that change what a reader produces; part of the key under which a loaded image is
/// shared.
struct ReaderOptions {
    /// Layer of a multi-layer EXR file ("beauty" reads beauty.R, beauty.G, ...); empty = the
    /// plain R, G, B, A (or Y) channels.
    std::string layer;

    /// The text that tells two option sets apart.
    std::string key() const { return "layer=" + layer; }
};

/// What a reader learned from the header.
struct ImageInfo {
    int32_t width = 0, height = 0;
    int bitsPerChannel = 8;  ///< 8, 16 or 32
    bool isFloat = false;    ///< for 16 and 32 bits: half or float data
    bool grey = false;       ///< one colour channel
    bool alpha = false;      ///< an alpha channel
};

/// Limits applied while reading untrusted files.
struct ReadLimits {
    /// Largest level-0 texel buffer, in bytes.
    uint64_t maxImageBytes = kDefaultMaxImageBytes;
};

/// Reads one image file from memory. open() parses the header; readPixels() decodes.
class ImageReader {
public:
    virtual ~ImageReader() = default;
    /// Parses the header of the bytes (which stay alive until readPixels returns). False after
    /// one error message naming `name`.
    virtual bool open(const std::string &name, const uint8_t *data, size_t size,
                      const ReaderOptions &options) = 0;
    /// The header facts; valid after open() succeeded.
    const ImageInfo &info() const { return info_; }
    /// The layout the reader decodes into (from info()).
    TexelFormat nativeFormat() const;
    /// Decodes the pixels into `out`, allocated here in nativeFormat() with rows bottom-up.
    /// False after one error message.
    virtual bool readPixels(TexelBuffer &out, const ReadLimits &limits) = 0;

protected:
    ImageInfo info_;
    std::string name_;
};

/// Makes readers of one format.
class IRFactory {
public:
    virtual ~IRFactory() = default;
    /// A new reader.
    virtual std::unique_ptr<ImageReader> create() const = 0;
};

/// Factories of the built-in readers.
std::unique_ptr<IRFactory> makeTGAFactory();
std::unique_ptr<IRFactory> makeJPEGFactory();
std::unique_ptr<IRFactory> makeTiffFactory();
std::unique_ptr<IRFactory> makeHDRFactory();
std::unique_ptr<IRFactory> makePNGFactory();
std::unique_ptr<IRFactory> makeSimpleExrFactory();
std::unique_ptr<IRFactory> makeBMPFactory();
std::unique_ptr<IRFactory> makeDDSFactory();

/// The extension of a texture name: the text after the last "." of its last path component,
/// lower-cased; "vendrel" for names served by the host ("vendrel://..."); empty when none.
std::string textureExtension(const std::string &name);

/// A map from lower-case extension to reader factory.
class ReaderRegistry {
public:
    /// The registry with the built-in readers: tga, jpeg, jpg, tif, tiff, hdr, png, exr, bmp, dds.
    ReaderRegistry();
    /// Adds a factory; false with "Image reader for extension %s already registered" when the
    /// extension is taken. The extension is compared without regard to case.
    bool registerReader(const std::string &extension, std::shared_ptr<IRFactory> factory);
    /// The factory for an extension, or null.
    const IRFactory *find(const std::string &extension) const;

private:
    std::map<std::string, std::shared_ptr<IRFactory>> factories_;
};

/// Decodes an image held in memory with the reader of an extension: the one entry point for
/// callers that already have the bytes. False after one error message.
bool decodeImage(const ReaderRegistry &registry, const std::string &extension,
                 const std::string &name, const uint8_t *data, size_t size,
                 const ReaderOptions &options, const ReadLimits &limits, TexelBuffer &out,
                 ImageInfo *info = nullptr);

/// A bounds-checked cursor over bytes, for the readers of the system's own formats.
class ByteReader {
public:
    ByteReader(const uint8_t *data, size_t size) : data_(data), size_(size) {}
    size_t size() const { return size_; }
    size_t position() const { return pos_; }
    size_t remaining() const { return size_ - pos_; }
    const uint8_t *data() const { return data_; }
    /// Moves to an absolute offset; false when it is past the end.
    bool seek(size_t pos) {
        if (pos > size_) return false;
        pos_ = pos;
        return true;
    }
    /// Copies n bytes out; false (and nothing consumed) when fewer remain.
    bool read(void *dst, size_t n) {
        if (n > remaining()) return false;
        std::memcpy(dst, data_ + pos_, n);
        pos_ += n;
        return true;
    }
    /// The next n bytes in place; null when fewer remain.
    const uint8_t *take(size_t n) {
        if (n > remaining()) return nullptr;
        const uint8_t *p = data_ + pos_;
        pos_ += n;
        return p;
    }
    /// One byte; false at the end.
    bool byte(uint8_t &b) { return read(&b, 1); }

private:
    const uint8_t *data_;
    size_t size_;
    size_t pos_ = 0;
};

}  // namespace ox
