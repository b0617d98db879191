#pragma once

#include <memory>

#include "shading/light_context.h"
#include "texture/texture.h"

namespace ox {

/// The lights' view of a loaded texture: a lookup by (u, v) with a unit footprint. The image is
/// projected once: coordinates outside [0, 1]^2 (and NaN) read the nearest edge texels instead
/// of repeating the image, and the edges never blend with the opposite side.
class OXTextureLookup final : public TextureLookupInterface {
public:
    /// Over a texture from the texture manager (shared, read-only); null reads black.
    explicit OXTextureLookup(std::shared_ptr<const OXTexture> texture);
    Color lookup(float u, float v) const override;
    const OXTexture *texture() const { return texture_.get(); }

private:
    std::shared_ptr<const OXTexture> texture_;
    // The range of the texel centres in u and v.
    float uMin_ = 0.5f, uMax_ = 0.5f, vMin_ = 0.5f, vMax_ = 0.5f;
};

}  // namespace ox
