#pragma once

#include <array>
#include <cstdint>
#include <fstream>
#include <string>
#include <vector>

/// A small uncompressed 24-bit TGA written by hand: w x h texels of (r, g, b), rows from the
/// bottom (the file's own order, so texel (x, y) is (x, y) of the loaded image).
namespace oxtest {

inline bool writeTGA(const std::string &path, int w, int h,
                     const std::vector<std::array<uint8_t, 3>> &bottomFirst) {
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    // clang-format off
    const uint8_t header[18] = {0, 0, 2, 0, 0, 0, 0, 0, 0, 0, 0, 0,
                                uint8_t(w), uint8_t(w >> 8), uint8_t(h), uint8_t(h >> 8), 24, 0};
    // clang-format on
    out.write(reinterpret_cast<const char *>(header), sizeof header);
    for (const auto &t : bottomFirst) {
        const char bgr[3] = {char(t[2]), char(t[1]), char(t[0])};
        out.write(bgr, 3);
    }
    return bool(out);
}

}  // namespace oxtest
