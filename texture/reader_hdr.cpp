// Radiance RGBE pictures ("32-bit_rle_rgbe"): flat, old-style and new-style run-length
// encoded scan lines, stored top-down ("-Y h +X w") or bottom-up ("+Y h +X w").

#include <cmath>
#include <cstdio>
#include <cstring>

#include "core/message.h"
#include "texture/image_reader.h"

namespace ox {
namespace {

/// A run-length file never packs more texels than this per byte of data; larger claims are
/// refused before anything is allocated.
constexpr uint64_t kMaxTexelsPerByte = 64;

class HDRReader final : public ImageReader {
public:
    bool open(const std::string &name, const uint8_t *data, size_t size,
              const ReaderOptions &) override {
        name_ = name;
        if (name.empty()) {
            message(kMsgError, 3, "No HDRI file name given");
            return false;
        }
        in_ = ByteReader(data, size);
        std::string line;
        if (!readLine(line) || (line.rfind("#?RADIANCE", 0) != 0 && line.rfind("#?RGBE", 0) != 0))
            return badHeader();
        bool rgbe = true;
        for (;;) {
            if (!readLine(line)) return badHeader();
            if (line.empty()) break;
            if (line.rfind("FORMAT=", 0) == 0) rgbe = line == "FORMAT=32-bit_rle_rgbe";
        }
        if (!rgbe || !readLine(line)) return badHeader();
        char ySign, xSign, yAxis, xAxis;
        long h = 0, w = 0;
        char extra;
        if (std::sscanf(line.c_str(), "%c%c %ld %c%c %ld %c", &ySign, &yAxis, &h, &xSign, &xAxis,
                        &w, &extra) != 6 ||
            yAxis != 'Y' || xAxis != 'X' || xSign != '+' || (ySign != '-' && ySign != '+') ||
            w <= 0 || h <= 0 || w > INT32_MAX || h > INT32_MAX)
            return badHeader();
        topDown_ = ySign == '-';
        info_.width = int32_t(w);
        info_.height = int32_t(h);
        info_.bitsPerChannel = 32;
        info_.isFloat = true;
        return true;
    }

    bool readPixels(TexelBuffer &out, const ReadLimits &limits) override {
        const uint64_t texels = uint64_t(info_.width) * uint64_t(info_.height);
        if (texels > uint64_t(in_.remaining()) * kMaxTexelsPerByte) return badData();
        if (texels * 12 > limits.maxImageBytes) {
            message(kMsgError, 3, "Not enough memory for HDR image %s", name_.c_str());
            return false;
        }
        if (!out.allocate(name_, info_.width, info_.height, nativeFormat(), limits.maxImageBytes))
            return false;
        const size_t w = size_t(info_.width);
        std::unique_ptr<uint8_t[]> rgbe(new uint8_t[w * 4]);
        for (int32_t y = 0; y < info_.height; ++y) {
            if (!readScanline(rgbe.get(), w)) return badData();
            float *dst = reinterpret_cast<float *>(out.row(y));
            for (size_t x = 0; x < w; ++x) {
                const uint8_t *p = rgbe.get() + 4 * x;
                const float f = p[3] ? std::ldexp(1.0f, int(p[3]) - (128 + 8)) : 0.0f;
                dst[3 * x] = (p[0] + 0.5f) * f * (p[3] != 0);
                dst[3 * x + 1] = (p[1] + 0.5f) * f * (p[3] != 0);
                dst[3 * x + 2] = (p[2] + 0.5f) * f * (p[3] != 0);
            }
        }
        if (topDown_) out.flipRows();
        return true;
    }

private:
    bool badHeader() {
        message(kMsgError, 3, "Unable to read HDRImage %s", name_.c_str());
        return false;
    }
    bool badData() {
        message(kMsgError, 3, "Unable to load HDRImage");
        message(kMsgError, 3, "Unable to read HDRImage %s", name_.c_str());
        return false;
    }
    bool readLine(std::string &line) {
        line.clear();
        uint8_t c;
        while (in_.byte(c)) {
            if (c == '\n') return true;
            if (line.size() > 4096) return false;
            line += char(c);
        }
        return false;
    }

    bool readScanline(uint8_t *row, size_t w) {
        const uint8_t *head = in_.data() + in_.position();
        if (w >= 8 && w < 0x8000 && in_.remaining() >= 4 && head[0] == 2 && head[1] == 2 &&
            !(head[2] & 0x80)) {
            if (size_t((head[2] << 8) | head[3]) != w) return false;
            in_.take(4);
            // New-style: each of the four components run-length encoded separately; runs are
            // bounded by the row.
            for (int c = 0; c < 4; ++c) {
                size_t x = 0;
                while (x < w) {
                    uint8_t count;
                    if (!in_.byte(count)) return false;
                    if (count > 128) {
                        const size_t n = count - 128;
                        uint8_t v;
                        if (n > w - x || !in_.byte(v)) return false;
                        for (size_t k = 0; k < n; ++k) row[4 * (x + k) + c] = v;
                        x += n;
                    } else {
                        if (count == 0 || count > w - x) return false;
                        const uint8_t *p = in_.take(count);
                        if (!p) return false;
                        for (size_t k = 0; k < count; ++k) row[4 * (x + k) + c] = p[k];
                        x += count;
                    }
                }
            }
            return true;
        }
        // Flat pixels, with the old-style repeat marker (1, 1, 1, n).
        size_t x = 0;
        int shift = 0;
        while (x < w) {
            const uint8_t *p = in_.take(4);
            if (!p) return false;
            if (p[0] == 1 && p[1] == 1 && p[2] == 1) {
                if (x == 0 || shift > 16) return false;
                const size_t n = size_t(p[3]) << shift;
                if (n > w - x) return false;
                for (size_t k = 0; k < n; ++k) std::memcpy(row + 4 * (x + k), row + 4 * (x - 1), 4);
                x += n;
                shift += 8;
            } else {
                std::memcpy(row + 4 * x, p, 4);
                ++x;
                shift = 0;
            }
        }
        return true;
    }

    ByteReader in_{nullptr, 0};
    bool topDown_ = true;
};

class HDRFactory final : public IRFactory {
public:
    std::unique_ptr<ImageReader> create() const override { return std::make_unique<HDRReader>(); }
};

}  // namespace

std::unique_ptr<IRFactory> makeHDRFactory() { return std::make_unique<HDRFactory>(); }

}  // namespace ox
