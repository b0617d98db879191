#pragma once

// Small image files made by the tests themselves, in memory: the formats read by the system's own
// readers are encoded by hand here; PNG, JPEG, TIFF and EXR through their libraries.

#include <ImfChannelList.h>
#include <ImfFrameBuffer.h>
#include <ImfHeader.h>
#include <ImfOutputFile.h>
#include <ImfStringAttribute.h>
#include <ImfTiledOutputFile.h>
#include <jpeglib.h>
#include <png.h>
#include <tiffio.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <csetjmp>
#include <cstdint>
#include <cstring>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include "core/types.h"

namespace oxtest {

using Bytes = std::vector<uint8_t>;

/// A picture as a viewer sees it: rows from the top, RGBA 8-bit.
struct Picture {
    int w = 0, h = 0;
    std::vector<uint8_t> rgba;  // top row first
    uint8_t *at(int x, int yTop) { return &rgba[(size_t(yTop) * w + x) * 4]; }
    const uint8_t *at(int x, int yTop) const { return &rgba[(size_t(yTop) * w + x) * 4]; }
};

/// A picture whose texels all differ: r = 10 x + 1, g = 20 y + 3, b = 7 (x + y) + 5, a = 255 - 9 x.
inline Picture testPicture(int w, int h) {
    Picture p{w, h, std::vector<uint8_t>(size_t(w) * h * 4)};
    for (int y = 0; y < h; ++y)
        for (int x = 0; x < w; ++x) {
            uint8_t *t = p.at(x, y);
            t[0] = uint8_t(10 * x + 1), t[1] = uint8_t(20 * y + 3), t[2] = uint8_t(7 * (x + y) + 5);
            t[3] = uint8_t(255 - 9 * x);
        }
    return p;
}

inline void put16(Bytes &b, unsigned v) { b.push_back(uint8_t(v)), b.push_back(uint8_t(v >> 8)); }
inline void put32(Bytes &b, uint32_t v) { put16(b, v & 0xffff), put16(b, v >> 16); }

/// TGA: type 2/10 (colour, 24 or 32 bits) or 3/11 (grey from the red channel, 8 bits).
inline Bytes makeTGA(const Picture &p, bool rle, bool grey, bool alpha, bool topDown, bool footer) {
    Bytes b;
    const int bpp = grey ? 1 : alpha ? 4 : 3;
    b.push_back(3);  // id length
    b.push_back(0);
    b.push_back(uint8_t((grey ? 3 : 2) + (rle ? 8 : 0)));
    for (int i = 0; i < 5; ++i) b.push_back(0);
    put16(b, 0), put16(b, 0), put16(b, unsigned(p.w)), put16(b, unsigned(p.h));
    b.push_back(uint8_t(bpp * 8));
    b.push_back(uint8_t((topDown ? 0x20 : 0) | (alpha ? 8 : 0)));
    b.push_back('i'), b.push_back('d'), b.push_back('!');
    std::vector<Bytes> texels;
    for (int r = 0; r < p.h; ++r) {
        const int yTop = topDown ? r : p.h - 1 - r;
        for (int x = 0; x < p.w; ++x) {
            const uint8_t *t = p.at(x, yTop);
            if (grey)
                texels.push_back({t[0]});
            else if (alpha)
                texels.push_back({t[2], t[1], t[0], t[3]});
            else
                texels.push_back({t[2], t[1], t[0]});
        }
    }
    if (!rle) {
        for (auto &t : texels) b.insert(b.end(), t.begin(), t.end());
    } else {
        // Runs of equal texels, raw packets otherwise; packets cross rows.
        size_t i = 0;
        while (i < texels.size()) {
            size_t run = 1;
            while (i + run < texels.size() && run < 128 && texels[i + run] == texels[i]) ++run;
            if (run > 1) {
                b.push_back(uint8_t(0x80 | (run - 1)));
                b.insert(b.end(), texels[i].begin(), texels[i].end());
                i += run;
            } else {
                size_t n = 1;
                while (i + n < texels.size() && n < 128 && texels[i + n] != texels[i + n - 1]) ++n;
                b.push_back(uint8_t(n - 1));
                for (size_t k = 0; k < n; ++k)
                    b.insert(b.end(), texels[i + k].begin(), texels[i + k].end());
                i += n;
            }
        }
    }
    if (footer) {
        put32(b, 0), put32(b, 0);
        const char sig[] = "TRUEVISION-XFILE.";
        b.insert(b.end(), sig, sig + 18);
    }
    return b;
}

/// BMP, 24 or 32 bits, bottom-up (positive height) or top-down (negative height).
inline Bytes makeBMP(const Picture &p, int bits, bool topDown) {
    const int bpp = bits / 8;
    const uint32_t rowBytes = (uint32_t(p.w) * bpp + 3) & ~3u;
    Bytes b{'B', 'M'};
    put32(b, 54 + rowBytes * p.h), put32(b, 0), put32(b, 54);
    put32(b, 40), put32(b, uint32_t(p.w)), put32(b, uint32_t(topDown ? -p.h : p.h));
    put16(b, 1), put16(b, unsigned(bits)), put32(b, 0), put32(b, rowBytes * p.h);
    put32(b, 2835), put32(b, 2835), put32(b, 0), put32(b, 0);
    for (int r = 0; r < p.h; ++r) {
        const int yTop = topDown ? r : p.h - 1 - r;
        const size_t start = b.size();
        for (int x = 0; x < p.w; ++x) {
            const uint8_t *t = p.at(x, yTop);
            b.push_back(t[2]), b.push_back(t[1]), b.push_back(t[0]);
            if (bpp == 4) b.push_back(t[3]);
        }
        while (b.size() - start < rowBytes) b.push_back(0);
    }
    return b;
}

/// An RGBE texel of a float colour.
inline void rgbe(float r, float g, float b, uint8_t out[4]) {
    const float m = std::max(r, std::max(g, b));
    if (m < 1e-32f) {
        out[0] = out[1] = out[2] = out[3] = 0;
        return;
    }
    int e;
    const float f = std::frexp(m, &e) * 256.0f / m;
    out[0] = uint8_t(r * f), out[1] = uint8_t(g * f), out[2] = uint8_t(b * f);
    out[3] = uint8_t(e + 128);
}

/// Radiance HDR of RGBE texels given top row first; rle uses new-style run-length scan lines.
inline Bytes makeHDR(int w, int h, const std::vector<std::array<uint8_t, 4>> &topFirst, bool rle,
                     bool topDown) {
    std::string head = "#?RADIANCE\n# made by a test\nFORMAT=32-bit_rle_rgbe\n\n";
    head += (topDown ? "-Y " : "+Y ") + std::to_string(h) + " +X " + std::to_string(w) + "\n";
    Bytes b(head.begin(), head.end());
    for (int r = 0; r < h; ++r) {
        const int yTop = topDown ? r : h - 1 - r;
        const auto *row = &topFirst[size_t(yTop) * w];
        if (!rle) {
            for (int x = 0; x < w; ++x) b.insert(b.end(), row[x].begin(), row[x].end());
            continue;
        }
        b.push_back(2), b.push_back(2), b.push_back(uint8_t(w >> 8)), b.push_back(uint8_t(w));
        for (int c = 0; c < 4; ++c) {
            int x = 0;
            while (x < w) {
                int run = 1;
                while (x + run < w && run < 127 && row[x + run][c] == row[x][c]) ++run;
                if (run >= 3) {
                    b.push_back(uint8_t(128 + run)), b.push_back(row[x][c]);
                    x += run;
                } else {
                    int n = 0;
                    const size_t at = b.size();
                    b.push_back(0);
                    while (x < w && n < 128) {
                        int r2 = 1;
                        while (x + r2 < w && r2 < 3 && row[x + r2][c] == row[x][c]) ++r2;
                        if (r2 >= 3) break;
                        b.push_back(row[x][c]);
                        ++x, ++n;
                    }
                    b[at] = uint8_t(n);
                    if (n == 0) b.pop_back();
                }
            }
        }
    }
    return b;
}

/// A DDS header followed by the given blocks.
inline Bytes makeDDS(int w, int h, const char *fourCC, const Bytes &blocks) {
    Bytes b{'D', 'D', 'S', ' '};
    put32(b, 124), put32(b, 0x1007), put32(b, uint32_t(h)), put32(b, uint32_t(w));
    put32(b, 0), put32(b, 0), put32(b, 1);
    for (int i = 0; i < 11; ++i) put32(b, 0);
    put32(b, 32), put32(b, 4);
    b.insert(b.end(), fourCC, fourCC + 4);
    for (int i = 0; i < 5; ++i) put32(b, 0);
    put32(b, 0x1000), put32(b, 0), put32(b, 0), put32(b, 0), put32(b, 0);
    b.insert(b.end(), blocks.begin(), blocks.end());
    return b;
}

// --- Library-written formats ------------------------------------------------------------------

inline void pngWrite(png_structp png, png_bytep data, png_size_t n) {
    auto *out = static_cast<Bytes *>(png_get_io_ptr(png));
    out->insert(out->end(), data, data + n);
}
inline void pngFlush(png_structp) {}

/// PNG of the picture: colour type and depth as given; 16-bit samples are v * 257 + x (so that
/// both bytes matter); palette images use one palette entry per distinct red value.
inline Bytes makePNG(const Picture &p, int colorType, int depth) {
    Bytes out;
    png_structp png = png_create_write_struct(PNG_LIBPNG_VER_STRING, nullptr, nullptr, nullptr);
    png_infop info = png_create_info_struct(png);
    if (setjmp(png_jmpbuf(png))) {
        png_destroy_write_struct(&png, &info);
        return {};
    }
    png_set_write_fn(png, &out, pngWrite, pngFlush);
    png_set_IHDR(png, info, uint32_t(p.w), uint32_t(p.h), depth, colorType, PNG_INTERLACE_NONE,
                 PNG_COMPRESSION_TYPE_DEFAULT, PNG_FILTER_TYPE_DEFAULT);
    if (colorType == PNG_COLOR_TYPE_PALETTE) {
        std::vector<png_color> pal(256);
        std::vector<png_byte> trans(256);
        for (int i = 0; i < 256; ++i)
            pal[i] = {png_byte(i), png_byte(255 - i), 7}, trans[i] = png_byte(i);
        png_set_PLTE(png, info, pal.data(), 256);
        png_set_tRNS(png, info, trans.data(), 256, nullptr);
    }
    png_write_info(png, info);
    const int channels = colorType == PNG_COLOR_TYPE_RGBA         ? 4
                         : colorType == PNG_COLOR_TYPE_RGB        ? 3
                         : colorType == PNG_COLOR_TYPE_GRAY_ALPHA ? 2
                                                                  : 1;
    const int bytes = depth / 8;
    std::vector<uint8_t> row(size_t(p.w) * channels * bytes);
    for (int y = 0; y < p.h; ++y) {
        for (int x = 0; x < p.w; ++x) {
            const uint8_t *t = p.at(x, y);
            uint8_t v[4] = {t[0], t[1], t[2], t[3]};
            if (channels == 2) v[1] = t[3];
            for (int c = 0; c < channels; ++c) {
                if (bytes == 1) {
                    row[size_t(x) * channels + c] = v[c];
                } else {
                    const unsigned s = v[c] * 257u + unsigned(x);
                    row[(size_t(x) * channels + c) * 2] = uint8_t(std::min(s, 65535u) >> 8);
                    row[(size_t(x) * channels + c) * 2 + 1] = uint8_t(std::min(s, 65535u));
                }
            }
        }
        png_write_row(png, row.data());
    }
    png_write_end(png, info);
    png_destroy_write_struct(&png, &info);
    return out;
}

/// JPEG of the picture (RGB or grey from red), quality 100.
inline Bytes makeJPEG(const Picture &p, bool grey) {
    jpeg_compress_struct c;
    jpeg_error_mgr err;
    c.err = jpeg_std_error(&err);
    jpeg_create_compress(&c);
    unsigned char *mem = nullptr;
    unsigned long size = 0;
    jpeg_mem_dest(&c, &mem, &size);
    c.image_width = JDIMENSION(p.w), c.image_height = JDIMENSION(p.h);
    c.input_components = grey ? 1 : 3;
    c.in_color_space = grey ? JCS_GRAYSCALE : JCS_RGB;
    jpeg_set_defaults(&c);
    jpeg_set_quality(&c, 100, TRUE);
    c.comp_info[0].h_samp_factor = c.comp_info[0].v_samp_factor = 1;  // no chroma subsampling
    jpeg_start_compress(&c, TRUE);
    std::vector<uint8_t> row(size_t(p.w) * 3);
    while (c.next_scanline < c.image_height) {
        for (int x = 0; x < p.w; ++x)
            for (int k = 0; k < (grey ? 1 : 3); ++k)
                row[size_t(x) * (grey ? 1 : 3) + k] = p.at(x, int(c.next_scanline))[k];
        JSAMPROW r = row.data();
        jpeg_write_scanlines(&c, &r, 1);
    }
    jpeg_finish_compress(&c);
    Bytes out(mem, mem + size);
    jpeg_destroy_compress(&c);
    free(mem);
    return out;
}

/// A TIFF file of float or integer samples; value(x, yTop, c) gives each sample.
template <typename T, typename F>
bool writeTIFF(const std::string &path, int w, int h, int spp, int format, bool tiled, F value) {
    TIFF *t = TIFFOpen(path.c_str(), "w");
    if (!t) return false;
    TIFFSetField(t, TIFFTAG_IMAGEWIDTH, w);
    TIFFSetField(t, TIFFTAG_IMAGELENGTH, h);
    TIFFSetField(t, TIFFTAG_SAMPLESPERPIXEL, spp);
    TIFFSetField(t, TIFFTAG_BITSPERSAMPLE, int(sizeof(T) * 8));
    TIFFSetField(t, TIFFTAG_SAMPLEFORMAT, format);
    TIFFSetField(t, TIFFTAG_PLANARCONFIG, PLANARCONFIG_CONTIG);
    TIFFSetField(t, TIFFTAG_PHOTOMETRIC, spp >= 3 ? PHOTOMETRIC_RGB : PHOTOMETRIC_MINISBLACK);
    TIFFSetField(t, TIFFTAG_COMPRESSION, COMPRESSION_ADOBE_DEFLATE);
    if (spp == 2 || spp == 4) {
        uint16_t extra = EXTRASAMPLE_UNASSALPHA;
        TIFFSetField(t, TIFFTAG_EXTRASAMPLES, 1, &extra);
    }
    bool ok = true;
    if (tiled) {
        TIFFSetField(t, TIFFTAG_TILEWIDTH, 16);
        TIFFSetField(t, TIFFTAG_TILELENGTH, 16);
        std::vector<T> tile(size_t(16 * 16 * spp));
        for (int ty = 0; ty < h; ty += 16)
            for (int tx = 0; tx < w; tx += 16) {
                for (int y = 0; y < 16; ++y)
                    for (int x = 0; x < 16; ++x)
                        for (int c = 0; c < spp; ++c)
                            tile[size_t((y * 16 + x) * spp + c)] =
                                (tx + x < w && ty + y < h) ? value(tx + x, ty + y, c) : T(0);
                ok &= TIFFWriteTile(t, tile.data(), uint32_t(tx), uint32_t(ty), 0, 0) >= 0;
            }
    } else {
        std::vector<T> row(size_t(w * spp));
        for (int y = 0; y < h; ++y) {
            for (int x = 0; x < w; ++x)
                for (int c = 0; c < spp; ++c) row[size_t(x * spp + c)] = value(x, y, c);
            ok &= TIFFWriteScanline(t, row.data(), uint32_t(y), 0) >= 0;
        }
    }
    TIFFClose(t);
    return ok;
}

/// An EXR file of the named channels, value(x, yTop, c) each, stored as `type` in scan lines
/// (tile 0) or in tiles of tile x tile texels; `activeTiles`, when given, is written as the
/// active-tiles attribute.
template <typename F>
void writeEXR(const std::string &path, int w, int h, const std::vector<std::string> &channels,
              Imf::PixelType type, int tile, F value, const char *activeTiles = nullptr) {
    Imf::Header hd(w, h);
    if (tile > 0) hd.setTileDescription(Imf::TileDescription(tile, tile, Imf::ONE_LEVEL));
    if (activeTiles) hd.insert("QUENDAL_ACTIVETILES_PLAIN_TEXT", Imf::StringAttribute(activeTiles));
    const size_t n = size_t(w) * size_t(h);
    std::vector<std::vector<float>> floats(channels.size(), std::vector<float>(n));
    std::vector<std::vector<Imath::half>> halves(channels.size(), std::vector<Imath::half>(n));
    Imf::FrameBuffer fb;
    for (size_t c = 0; c < channels.size(); ++c) {
        for (size_t i = 0; i < n; ++i)
            halves[c][i] = floats[c][i] = value(int(i % size_t(w)), int(i / size_t(w)), int(c));
        hd.channels().insert(channels[c], Imf::Channel(type));
        char *base = type == Imf::HALF ? reinterpret_cast<char *>(halves[c].data())
                                       : reinterpret_cast<char *>(floats[c].data());
        const size_t size = type == Imf::HALF ? sizeof(Imath::half) : sizeof(float);
        fb.insert(channels[c], Imf::Slice(type, base, size, size * size_t(w)));
    }
    if (tile > 0) {
        Imf::TiledOutputFile out(path.c_str(), hd);
        out.setFrameBuffer(fb);
        out.writeTiles(0, out.numXTiles() - 1, 0, out.numYTiles() - 1);
    } else {
        Imf::OutputFile out(path.c_str(), hd);
        out.setFrameBuffer(fb);
        out.writePixels(h);
    }
}

/// Reads a whole file.
inline Bytes readBytes(const std::string &path) {
    std::ifstream in(path, std::ios::binary);
    std::stringstream s;
    s << in.rdbuf();
    const std::string t = s.str();
    return Bytes(t.begin(), t.end());
}
inline void writeBytes(const std::string &path, const Bytes &b) {
    std::ofstream(path, std::ios::binary)
        .write(reinterpret_cast<const char *>(b.data()), std::streamsize(b.size()));
}

}  // namespace oxtest
