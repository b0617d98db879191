#include "texture/image_reader.h"

#include <algorithm>
#include <cctype>

#include "core/message.h"

namespace ox {

TexelFormat ImageReader::nativeFormat() const {
    TexelFormat f;
    const int channels = (info_.grey ? 1 : 3) + (info_.alpha ? 1 : 0);
    if (!TexelFormat::fromBits(info_.bitsPerChannel, info_.isFloat, channels, f))
        f = {TexelType::kU8, 4};
    return f;
}

std::string textureExtension(const std::string &name) {
    if (name.rfind("vendrel://", 0) == 0) return "vendrel";
    const size_t slash = name.find_last_of("/\\");
    const size_t start = slash == std::string::npos ? 0 : slash + 1;
    const size_t dot = name.rfind('.');
    if (dot == std::string::npos || dot < start) return {};
    std::string ext = name.substr(dot + 1);
    std::transform(ext.begin(), ext.end(), ext.begin(),
                   [](unsigned char c) { return char(std::tolower(c)); });
    return ext;
}

namespace {

std::string lower(std::string s) {
    std::transform(s.begin(), s.end(), s.begin(),
                   [](unsigned char c) { return char(std::tolower(c)); });
    return s;
}

}  // namespace

ReaderRegistry::ReaderRegistry() {
    std::shared_ptr<IRFactory> jpeg = makeJPEGFactory(), tiff = makeTiffFactory();
    registerReader("tga", makeTGAFactory());
    registerReader("jpeg", jpeg);
    registerReader("jpg", jpeg);
    registerReader("tif", tiff);
    registerReader("tiff", tiff);
    registerReader("hdr", makeHDRFactory());
    registerReader("png", makePNGFactory());
    registerReader("exr", makeSimpleExrFactory());
    registerReader("bmp", makeBMPFactory());
    registerReader("dds", makeDDSFactory());
}

bool ReaderRegistry::registerReader(const std::string &extension,
                                    std::shared_ptr<IRFactory> factory) {
    const std::string ext = lower(extension);
    if (factories_.count(ext)) {
        message(kMsgError, 3, "Image reader for extension %s already registered", ext.c_str());
        return false;
    }
    factories_[ext] = std::move(factory);
    return true;
}

const IRFactory *ReaderRegistry::find(const std::string &extension) const {
    auto it = factories_.find(lower(extension));
    return it == factories_.end() ? nullptr : it->second.get();
}

bool decodeImage(const ReaderRegistry &registry, const std::string &extension,
                 const std::string &name, const uint8_t *data, size_t size,
                 const ReaderOptions &options, const ReadLimits &limits, TexelBuffer &out,
                 ImageInfo *info) {
    const IRFactory *factory = registry.find(extension);
    if (!factory) {
        message(kMsgError, 3, "No image reader for extension %s registered", extension.c_str());
        return false;
    }
    std::unique_ptr<ImageReader> reader = factory->create();
    if (!reader->open(name, data, size, options)) return false;
    if (info) *info = reader->info();
    if (!reader->readPixels(out, limits)) {
        out.clear();
        return false;
    }
    return true;
}

}  // namespace ox
