// TIFF through libtiff: grey and RGB with or without alpha in 8, 16 and 32 bits (unsigned or
// float, 16-bit float as half), strips or tiles, interleaved or planar; other 8-bit layouts
// (palette, CMYK, YCbCr, bilevel) through the library's RGBA conversion.

#include <tiffio.h>

#include <algorithm>
#include <cstring>
#include <vector>

#include "core/message.h"
#include "texture/image_reader.h"

namespace ox {
namespace {

struct MemoryFile {
    const uint8_t *data;
    uint64_t size;
    uint64_t pos;
    std::string error;
};

tmsize_t readProc(thandle_t h, void *buf, tmsize_t n) {
    auto *f = static_cast<MemoryFile *>(h);
    if (n <= 0 || f->pos >= f->size) return 0;
    const uint64_t k = std::min<uint64_t>(uint64_t(n), f->size - f->pos);
    std::memcpy(buf, f->data + f->pos, size_t(k));
    f->pos += k;
    return tmsize_t(k);
}
tmsize_t writeProc(thandle_t, void *, tmsize_t) { return -1; }
toff_t seekProc(thandle_t h, toff_t off, int whence) {
    auto *f = static_cast<MemoryFile *>(h);
    uint64_t base = whence == SEEK_SET ? 0 : whence == SEEK_CUR ? f->pos : f->size;
    if (off > UINT64_MAX - base) return toff_t(-1);
    f->pos = base + off;
    return f->pos;
}
int closeProc(thandle_t) { return 0; }
toff_t sizeProc(thandle_t h) { return static_cast<MemoryFile *>(h)->size; }
int mapProc(thandle_t, void **, toff_t *) { return 0; }
void unmapProc(thandle_t, void *, toff_t) {}

int onError(TIFF *, void *user, const char *module, const char *fmt, va_list ap) {
    auto *f = static_cast<MemoryFile *>(user);
    if (f->error.empty()) {
        char text[512];
        std::vsnprintf(text, sizeof text, fmt, ap);
        f->error = text;
    }
    return 1;
}
int onWarning(TIFF *, void *, const char *, const char *, va_list) { return 1; }

class TiffReader final : public ImageReader {
public:
    ~TiffReader() override {
        if (tif_) TIFFClose(tif_);
    }

    bool open(const std::string &name, const uint8_t *data, size_t size,
              const ReaderOptions &) override {
        name_ = name;
        file_ = {data, size, 0, {}};
        message(kMsgDebug, 3, "Reading TIFF-file '%s'.", name.c_str());
        TIFFOpenOptions *opts = TIFFOpenOptionsAlloc();
        TIFFOpenOptionsSetErrorHandlerExtR(opts, onError, &file_);
        TIFFOpenOptionsSetWarningHandlerExtR(opts, onWarning, &file_);
        TIFFOpenOptionsSetMaxSingleMemAlloc(opts, tmsize_t(256) << 20);
        tif_ = TIFFClientOpenExt(name.c_str(), "rm", &file_, readProc, writeProc, seekProc,
                                 closeProc, sizeProc, mapProc, unmapProc, opts);
        TIFFOpenOptionsFree(opts);
        if (!tif_) return fail();
        uint32_t w = 0, h = 0;
        uint16_t spp = 1, bits = 1, format = SAMPLEFORMAT_UINT, photometric = PHOTOMETRIC_RGB;
        TIFFGetField(tif_, TIFFTAG_IMAGEWIDTH, &w);
        TIFFGetField(tif_, TIFFTAG_IMAGELENGTH, &h);
        TIFFGetFieldDefaulted(tif_, TIFFTAG_SAMPLESPERPIXEL, &spp);
        TIFFGetFieldDefaulted(tif_, TIFFTAG_BITSPERSAMPLE, &bits);
        TIFFGetFieldDefaulted(tif_, TIFFTAG_SAMPLEFORMAT, &format);
        TIFFGetFieldDefaulted(tif_, TIFFTAG_PLANARCONFIG, &planar_);
        TIFFGetField(tif_, TIFFTAG_PHOTOMETRIC, &photometric);
        TIFFGetFieldDefaulted(tif_, TIFFTAG_ORIENTATION, &orientation_);
        if (w == 0 || h == 0 || w > INT32_MAX || h > INT32_MAX) return fail("bad image size");
        if (spp < 1 || spp > 4) {
            message(kMsgError, 3, "TIFF-image '%s' has unsupported samples per pixel %d.",
                    name.c_str(), int(spp));
            return false;
        }
        info_.width = int32_t(w);
        info_.height = int32_t(h);
        const bool plainLayout = (photometric == PHOTOMETRIC_MINISBLACK && spp <= 2) ||
                                 (photometric == PHOTOMETRIC_RGB && spp >= 3);
        const bool plainSamples =
            (bits == 8 && format == SAMPLEFORMAT_UINT) ||
            (bits == 16 && (format == SAMPLEFORMAT_UINT || format == SAMPLEFORMAT_IEEEFP)) ||
            (bits == 32 && (format == SAMPLEFORMAT_UINT || format == SAMPLEFORMAT_IEEEFP));
        direct_ = plainLayout && plainSamples;
        if (direct_) {
            info_.bitsPerChannel = bits;
            info_.isFloat = format == SAMPLEFORMAT_IEEEFP;
            info_.grey = spp <= 2;
            info_.alpha = spp == 2 || spp == 4;
            spp_ = spp;
            return true;
        }
        char why[1024] = "";
        if (!TIFFRGBAImageOK(tif_, why)) return fail(why);
        info_.bitsPerChannel = 8;
        info_.alpha = true;
        return true;
    }

    bool readPixels(TexelBuffer &out, const ReadLimits &limits) override {
        if (!out.allocate(name_, info_.width, info_.height, nativeFormat(), limits.maxImageBytes))
            return false;
        if (!direct_) {
            if (!TIFFReadRGBAImageOriented(tif_, uint32_t(info_.width), uint32_t(info_.height),
                                           reinterpret_cast<uint32_t *>(out.data()),
                                           ORIENTATION_BOTLEFT, 0))
                return fail();
            return true;
        }
        const bool ok = TIFFIsTiled(tif_) ? readTiles(out) : readStrips(out);
        if (!ok) return fail();
        // Rows were stored top-down into rows 0.. of the buffer; the picture's bottom comes first.
        if (orientation_ != ORIENTATION_BOTLEFT) out.flipRows();
        return true;
    }

private:
    bool fail(const char *why = nullptr) {
        message(kMsgError, 3, "Error opening texture %s (%s)", name_.c_str(),
                why && *why           ? why
                : file_.error.empty() ? "cannot read TIFF"
                                      : file_.error.c_str());
        return false;
    }

    bool readStrips(TexelBuffer &out) {
        const tmsize_t lineSize = TIFFScanlineSize(tif_);
        if (lineSize <= 0) return false;
        std::vector<uint8_t> line(static_cast<size_t>(lineSize));
        const size_t bps = size_t(out.format().bytesPerChannel());
        if (planar_ == PLANARCONFIG_CONTIG) {
            if (size_t(lineSize) < out.rowBytes()) return false;
            for (int32_t y = 0; y < info_.height; ++y) {
                if (TIFFReadScanline(tif_, line.data(), uint32_t(y), 0) < 0) return false;
                std::memcpy(out.row(y), line.data(), out.rowBytes());
            }
            return true;
        }
        if (size_t(lineSize) < size_t(info_.width) * bps) return false;
        for (int s = 0; s < spp_; ++s)
            for (int32_t y = 0; y < info_.height; ++y) {
                if (TIFFReadScanline(tif_, line.data(), uint32_t(y), uint16_t(s)) < 0) return false;
                uint8_t *dst = out.row(y) + size_t(s) * bps;
                for (int32_t x = 0; x < info_.width; ++x)
                    std::memcpy(dst + size_t(x) * spp_ * bps, line.data() + size_t(x) * bps, bps);
            }
        return true;
    }

    bool readTiles(TexelBuffer &out) {
        if (planar_ != PLANARCONFIG_CONTIG) return false;
        uint32_t tw = 0, th = 0;
        TIFFGetField(tif_, TIFFTAG_TILEWIDTH, &tw);
        TIFFGetField(tif_, TIFFTAG_TILELENGTH, &th);
        const tmsize_t tileSize = TIFFTileSize(tif_);
        const size_t texel = size_t(out.format().bytesPerTexel());
        if (tw == 0 || th == 0 || tileSize <= 0 || uint64_t(tileSize) < uint64_t(tw) * th * texel)
            return false;
        std::vector<uint8_t> tile(static_cast<size_t>(tileSize));
        for (uint32_t ty = 0; ty < uint32_t(info_.height); ty += th)
            for (uint32_t tx = 0; tx < uint32_t(info_.width); tx += tw) {
                if (TIFFReadTile(tif_, tile.data(), tx, ty, 0, 0) < 0) return false;
                const uint32_t cw = std::min<uint32_t>(tw, uint32_t(info_.width) - tx);
                const uint32_t ch = std::min<uint32_t>(th, uint32_t(info_.height) - ty);
                for (uint32_t r = 0; r < ch; ++r)
                    std::memcpy(out.row(int32_t(ty + r)) + size_t(tx) * texel,
                                tile.data() + size_t(r) * tw * texel, size_t(cw) * texel);
            }
        return true;
    }

    MemoryFile file_{};
    TIFF *tif_ = nullptr;
    uint16_t planar_ = PLANARCONFIG_CONTIG, orientation_ = ORIENTATION_TOPLEFT;
    int spp_ = 1;
    bool direct_ = false;
};

class TiffFactory final : public IRFactory {
public:
    std::unique_ptr<ImageReader> create() const override { return std::make_unique<TiffReader>(); }
};

}  // namespace

std::unique_ptr<IRFactory> makeTiffFactory() { return std::make_unique<TiffFactory>(); }

}  // namespace ox
