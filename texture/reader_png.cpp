// PNG through libpng: 8 and 16 bits, grey and colour, with alpha; palettes, transparency
// chunks and low bit depths are expanded. Library errors jump back and become a failed read.

#include <png.h>

#include <csetjmp>
#include <cstring>
#include <vector>

#include "core/message.h"
#include "texture/image_reader.h"

namespace ox {
namespace {

struct MemorySource {
    const uint8_t *data;
    size_t size;
    size_t pos;
    char error[256];
};

void readData(png_structp png, png_bytep out, png_size_t n) {
    auto *src = static_cast<MemorySource *>(png_get_io_ptr(png));
    if (n > src->size - src->pos) png_error(png, "unexpected end of file");
    std::memcpy(out, src->data + src->pos, n);
    src->pos += n;
}

void onError(png_structp png, png_const_charp text) {
    auto *src = static_cast<MemorySource *>(png_get_error_ptr(png));
    std::snprintf(src->error, sizeof src->error, "%s", text);
    png_longjmp(png, 1);
}

void onWarning(png_structp, png_const_charp) {}

class PNGReader final : public ImageReader {
public:
    ~PNGReader() override {
        if (png_) png_destroy_read_struct(&png_, &info_ptr_, nullptr);
    }

    bool open(const std::string &name, const uint8_t *data, size_t size,
              const ReaderOptions &) override {
        name_ = name;
        src_ = {data, size, 0, {0}};
        if (size < 8 || png_sig_cmp(data, 0, 8) != 0) {
            std::snprintf(src_.error, sizeof src_.error, "not a PNG file");
            return fail();
        }
        png_ = png_create_read_struct(PNG_LIBPNG_VER_STRING, &src_, onError, onWarning);
        if (!png_) return fail();
        info_ptr_ = png_create_info_struct(png_);
        if (!info_ptr_) return fail();
        if (setjmp(png_jmpbuf(png_))) return fail();
        png_set_read_fn(png_, &src_, readData);
        png_read_info(png_, info_ptr_);
        const int colorType = png_get_color_type(png_, info_ptr_);
        const int depth = png_get_bit_depth(png_, info_ptr_);
        if (colorType == PNG_COLOR_TYPE_PALETTE) png_set_palette_to_rgb(png_);
        if (colorType == PNG_COLOR_TYPE_GRAY && depth < 8) png_set_expand_gray_1_2_4_to_8(png_);
        if (png_get_valid(png_, info_ptr_, PNG_INFO_tRNS)) png_set_tRNS_to_alpha(png_);
        if (depth == 16) png_set_swap(png_);  // native little-endian 16-bit texels
        png_set_interlace_handling(png_);
        png_read_update_info(png_, info_ptr_);
        const int channels = png_get_channels(png_, info_ptr_);
        const int outDepth = png_get_bit_depth(png_, info_ptr_);
        if (channels < 1 || channels > 4 || (outDepth != 8 && outDepth != 16)) {
            std::snprintf(src_.error, sizeof src_.error, "unsupported layout");
            return fail();
        }
        info_.width = int32_t(png_get_image_width(png_, info_ptr_));
        info_.height = int32_t(png_get_image_height(png_, info_ptr_));
        info_.bitsPerChannel = outDepth;
        info_.grey = channels <= 2;
        info_.alpha = channels == 2 || channels == 4;
        return info_.width > 0 && info_.height > 0;
    }

    bool readPixels(TexelBuffer &out, const ReadLimits &limits) override {
        if (!out.allocate(name_, info_.width, info_.height, nativeFormat(), limits.maxImageBytes))
            return false;
        if (png_get_rowbytes(png_, info_ptr_) != out.rowBytes()) {
            std::snprintf(src_.error, sizeof src_.error, "unexpected row size");
            return fail();
        }
        // Rows arrive top-down; row 0 of the buffer is the bottom of the picture.
        rows_.resize(size_t(info_.height));
        for (int32_t y = 0; y < info_.height; ++y) rows_[size_t(y)] = out.row(info_.height - 1 - y);
        if (setjmp(png_jmpbuf(png_))) return fail();
        png_read_image(png_, rows_.data());
        return true;
    }

private:
    bool fail() {
        message(kMsgError, 3, "Error opening texture %s (%s)", name_.c_str(),
                src_.error[0] ? src_.error : "cannot start libpng");
        return false;
    }

    MemorySource src_{};
    png_structp png_ = nullptr;
    png_infop info_ptr_ = nullptr;
    std::vector<png_bytep> rows_;
};

class PNGFactory final : public IRFactory {
public:
    std::unique_ptr<ImageReader> create() const override { return std::make_unique<PNGReader>(); }
};

}  // namespace

std::unique_ptr<IRFactory> makePNGFactory() { return std::make_unique<PNGFactory>(); }

}  // namespace ox
