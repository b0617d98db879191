// JPEG through libjpeg: grey and colour (YCbCr, RGB, CMYK and YCCK converted to RGB).
// Library errors come back through a jump out of the error manager and become a failed read.

// clang-format off
#include <csetjmp>
#include <cstddef>
#include <cstdio>
#include <jpeglib.h>  // needs size_t and FILE declared before it
// clang-format on

#include "core/message.h"
#include "texture/image_reader.h"

namespace ox {
namespace {

struct ErrorManager {
    jpeg_error_mgr pub;
    jmp_buf jump;
    char text[JMSG_LENGTH_MAX];
    char warning[JMSG_LENGTH_MAX];  // the first warning (a truncated or damaged stream)
};

void errorExit(j_common_ptr cinfo) {
    auto *err = reinterpret_cast<ErrorManager *>(cinfo->err);
    cinfo->err->format_message(cinfo, err->text);
    longjmp(err->jump, 1);
}

void onMessage(j_common_ptr cinfo, int level) {
    auto *err = reinterpret_cast<ErrorManager *>(cinfo->err);
    if (level < 0 && !err->warning[0]) cinfo->err->format_message(cinfo, err->warning);
}

class JPEGReader final : public ImageReader {
public:
    JPEGReader() {
        cinfo_.err = jpeg_std_error(&err_.pub);
        err_.pub.error_exit = errorExit;
        err_.pub.emit_message = onMessage;
        err_.text[0] = 0;
        jpeg_create_decompress(&cinfo_);
    }
    ~JPEGReader() override { jpeg_destroy_decompress(&cinfo_); }

    bool open(const std::string &name, const uint8_t *data, size_t size,
              const ReaderOptions &) override {
        name_ = name;
        if (setjmp(err_.jump)) return fail();
        jpeg_mem_src(&cinfo_, data, static_cast<unsigned long>(size));
        jpeg_read_header(&cinfo_, TRUE);
        const J_COLOR_SPACE cs = cinfo_.jpeg_color_space;
        cmyk_ = cs == JCS_CMYK || cs == JCS_YCCK;
        cinfo_.out_color_space = cs == JCS_GRAYSCALE ? JCS_GRAYSCALE : cmyk_ ? JCS_CMYK : JCS_RGB;
        info_.width = int32_t(cinfo_.image_width);
        info_.height = int32_t(cinfo_.image_height);
        info_.grey = cs == JCS_GRAYSCALE;
        return true;
    }

    bool readPixels(TexelBuffer &out, const ReadLimits &limits) override {
        if (!out.allocate(name_, info_.width, info_.height, nativeFormat(), limits.maxImageBytes))
            return false;
        if (setjmp(err_.jump)) return fail();
        jpeg_start_decompress(&cinfo_);
        const int channels = cinfo_.output_components;
        if ((channels != 1 && channels != 3 && channels != 4) ||
            int32_t(cinfo_.output_width) != info_.width ||
            int32_t(cinfo_.output_height) != info_.height)
            return fail();
        if (cmyk_) row_.reset(new uint8_t[size_t(info_.width) * 4]);
        while (cinfo_.output_scanline < cinfo_.output_height) {
            // Rows arrive top-down; row 0 of the buffer is the bottom of the picture.
            uint8_t *dst = out.row(info_.height - 1 - int32_t(cinfo_.output_scanline));
            JSAMPROW target = cmyk_ ? row_.get() : dst;
            jpeg_read_scanlines(&cinfo_, &target, 1);
            if (cmyk_) {
                // Adobe writes inverted CMYK: the stored values are 255 - ink.
                for (int32_t x = 0; x < info_.width; ++x) {
                    const uint8_t *p = row_.get() + 4 * x;
                    for (int c = 0; c < 3; ++c) dst[3 * x + c] = uint8_t((p[c] * p[3] + 127) / 255);
                }
            }
        }
        jpeg_finish_decompress(&cinfo_);
        // libjpeg fills what a damaged stream lacks; the picture is kept, with one warning.
        if (err_.warning[0])
            message(kMsgWarning, 3, "Damaged JPEG file %s (%s)", name_.c_str(), err_.warning);
        return true;
    }

private:
    bool fail() {
        message(kMsgError, 3, "Error opening texture %s (%s)", name_.c_str(),
                err_.text[0] ? err_.text : "not a JPEG file");
        return false;
    }

    jpeg_decompress_struct cinfo_{};
    ErrorManager err_{};
    std::unique_ptr<uint8_t[]> row_;
    bool cmyk_ = false;
};

class JPEGFactory final : public IRFactory {
public:
    std::unique_ptr<ImageReader> create() const override { return std::make_unique<JPEGReader>(); }
};

}  // namespace

std::unique_ptr<IRFactory> makeJPEGFactory() { return std::make_unique<JPEGFactory>(); }

}  // namespace ox
