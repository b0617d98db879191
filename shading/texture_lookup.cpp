#include "shading/texture_lookup.h"

namespace ox {
namespace {

// v kept within [lo, hi]; NaN gives lo.
inline float within(float v, float lo, float hi) { return v > lo ? (v < hi ? v : hi) : lo; }

}  // namespace

OXTextureLookup::OXTextureLookup(std::shared_ptr<const OXTexture> texture)
    : texture_(std::move(texture)) {
    const Vec2i size = texture_ ? texture_->resolution() : Vec2i{0, 0};
    if (size.x > 0 && size.y > 0) {
        uMin_ = 0.5f / float(size.x), uMax_ = 1.0f - uMin_;
        vMin_ = 0.5f / float(size.y), vMax_ = 1.0f - vMin_;
    }
}

Color OXTextureLookup::lookup(float u, float v) const {
    if (!texture_) return Color::black();
    return texture_->lookup(TextureLookup{within(u, uMin_, uMax_), within(v, vMin_, vMax_)});
}

}  // namespace ox
