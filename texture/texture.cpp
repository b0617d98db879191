#include "texture/texture.h"

namespace ox {

bool ImageTexture::readPixels(const Region &region, Color *out) const {
    const TexelBuffer &b = image_->level(0);
    if (!region.valid || region.xMin < 0 || region.yMin < 0 || region.xMax > b.width() ||
        region.yMax > b.height() || region.xMin > region.xMax || region.yMin > region.yMax)
        return false;
    for (int32_t y = region.yMin; y < region.yMax; ++y)
        for (int32_t x = region.xMin; x < region.xMax; ++x) *out++ = b.texel(x, y);
    return true;
}

std::unique_ptr<OXTexture> makeTexture(std::shared_ptr<const MipImage> image, int filterMode) {
    switch (filterMode) {
        case kFilterSimple:
            return std::make_unique<SimpleTexture>(std::move(image));
        case kFilterEWA:
            return std::make_unique<EWATexture>(std::move(image));
        case kFilterAniso:
            return std::make_unique<AnisoTexture>(std::move(image));
        case kFilterPrepass:
            return std::make_unique<PrepassMipMapTexture>(std::move(image));
        default:
            return std::make_unique<MipMapTexture>(std::move(image));
    }
}

}  // namespace ox
