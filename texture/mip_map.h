#pragma once

#include <string>
#include <vector>

#include "texture/texel_buffer.h"

/// The mip chain of a loaded image.
namespace ox {

/// The sizes of a mip chain: level 0 is width x height, each next level max(1, size / 2) on each
/// axis, until a level is less than 2 texels wide and less than 2 high (1 x 1 has one level,
/// 4 x 1 has 4 x 1, 2 x 1, 1 x 1).
std::vector<Vec2i> mipLevelSizes(int32_t width, int32_t height);

/// A loaded image: the level-0 texel buffer and its smaller levels, all in the same layout;
/// shared read-only by every lookup object of one file.
class MipImage {
public:
    /// The file name the image came from.
    const std::string &name() const { return name_; }
    int levelCount() const { return int(levels_.size()); }
    const TexelBuffer &level(int i) const { return levels_[size_t(i)]; }
    int32_t width() const { return levels_.empty() ? 0 : levels_[0].width(); }
    int32_t height() const { return levels_.empty() ? 0 : levels_[0].height(); }
    /// True when the source had more than 8 bits per channel.
    bool isHDR() const { return hdr_; }
    /// Bits per channel of the source file.
    int sourceBitsPerChannel() const { return sourceBits_; }
    /// Bytes held by all levels.
    uint64_t sizeBytes() const;

    /// Takes level 0 and builds the smaller levels from it by box filtering (odd sizes fold
    /// their last row or column into the last texel of the next level, so every level keeps the
    /// mean of the one above). False (one error) when a level cannot be allocated.
    bool build(const std::string &name, TexelBuffer level0, bool hdr, int sourceBits,
               uint64_t maxBytes = kDefaultMaxImageBytes);
    /// Takes a complete chain as it is (from the texture cache); false when the sizes or layouts
    /// of the levels do not form a chain.
    bool adopt(const std::string &name, std::vector<TexelBuffer> levels, bool hdr, int sourceBits);

private:
    std::string name_;
    std::vector<TexelBuffer> levels_;
    bool hdr_ = false;
    int sourceBits_ = 8;
};

/// Box-filters src into dst (of size max(1, w / 2) x max(1, h / 2), same layout).
void downsampleLevel(const TexelBuffer &src, TexelBuffer &dst);

}  // namespace ox
