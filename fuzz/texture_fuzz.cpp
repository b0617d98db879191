// libFuzzer target over every image reader: the first byte of the input picks the reader, the
// rest is the file. A decoded image also gets its mip chain and one lookup of each filter, so
// that odd sizes reach the filters too.

#include <cstddef>
#include <cstdint>

#include "core/message.h"
#include "texture/image_reader.h"
#include "texture/texture.h"

namespace {

const char *const kExtensions[] = {"tga", "jpg", "tif", "hdr", "png", "exr", "bmp", "dds"};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    static const bool quiet = [] {
        ox::setTypeEnabled(0xffffffffu, false);
        return true;
    }();
    (void)quiet;
    if (size < 1) return 0;
    static const ox::ReaderRegistry registry;
    const char *ext = kExtensions[data[0] % (sizeof kExtensions / sizeof kExtensions[0])];
    ox::ReadLimits limits;
    limits.maxImageBytes = uint64_t(1) << 20;  // keeps every run short
    ox::TexelBuffer level0;
    ox::ImageInfo info;
    if (!ox::decodeImage(registry, ext, "fuzz", data + 1, size - 1, {}, limits, level0, &info))
        return 0;
    auto image = std::make_shared<ox::MipImage>();
    if (!image->build("fuzz", std::move(level0), info.bitsPerChannel > 8, info.bitsPerChannel,
                      limits.maxImageBytes))
        return 0;
    for (int mode = 0; mode <= 4; ++mode)
        ox::makeTexture(image, mode)->lookup({0.3f, 0.7f, 0.01f, 0.002f, -0.003f, 0.02f});
    return 0;
}
