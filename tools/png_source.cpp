// PNG input through libpng's row interface: palette, low-bit and 16-bit
// images are expanded or scaled to 8 bits by libpng's transforms, and
// transparency is laid on a background colour here. Non-interlaced images are
// read row by row as the encoder asks; an interlaced image only becomes
// complete after its last pass, so it is read whole.
#include "tool.h"

#include <png.h>

#include <csetjmp>
#include <cstdio>
#include <cstring>

namespace tool {
namespace {

// Shared with libpng's callbacks, which are C and must not be left by an
// exception: a failure is written here and reported through png_error.
struct PngState {
    Input* in;
    char message[256];
};

void on_error(png_structp png, png_const_charp message) {
    auto* state = static_cast<PngState*>(png_get_error_ptr(png));
    if (state->message[0] == '\0') std::snprintf(state->message, sizeof state->message, "%s", message);
    png_longjmp(png, 1);
}

void on_warning(png_structp, png_const_charp) {}

void on_read(png_structp png, png_bytep data, size_t length) {
    auto* state = static_cast<PngState*>(png_get_io_ptr(png));
    bool ok = false;
    try {
        ok = state->in->read(data, length) == length;
        if (!ok) std::snprintf(state->message, sizeof state->message, "file ends early (truncated?)");
    } catch (const std::exception& e) {
        std::snprintf(state->message, sizeof state->message, "%s", e.what());
    }
    if (!ok) png_error(png, state->message);
}

// Every libpng call that can fail runs in one of these frames behind its own
// setjmp; they hold nothing that a jump back would fail to destroy.
bool read_header(png_structp png, png_infop info, int& passes) {
    if (setjmp(png_jmpbuf(png))) return false;
    png_read_info(png, info);
    png_set_expand(png);
    png_set_scale_16(png);
    passes = png_set_interlace_handling(png);
    png_read_update_info(png, info);
    return true;
}

bool read_row(png_structp png, uint8_t* row) {
    if (setjmp(png_jmpbuf(png))) return false;
    png_read_row(png, row, nullptr);
    return true;
}

bool read_image(png_structp png, uint8_t** rows) {
    if (setjmp(png_jmpbuf(png))) return false;
    png_read_image(png, rows);
    return true;
}

inline uint8_t over(uint32_t colour, uint32_t alpha, uint32_t background) {
    return static_cast<uint8_t>((colour * alpha + background * (255 - alpha) + 127) / 255);
}

class PngSource : public Source {
public:
    PngSource(Input& in, const uint8_t background[3]) : state_{&in, {}} {
        std::memcpy(background_, background, 3);
        png_ = png_create_read_struct(PNG_LIBPNG_VER_STRING, &state_, on_error, on_warning);
        if (png_ != nullptr) info_ = png_create_info_struct(png_);
        if (info_ == nullptr) fail("out of memory");
        png_set_read_fn(png_, &state_, on_read);
    }
    ~PngSource() override { png_destroy_read_struct(&png_, &info_, nullptr); }

    void start() {
        int passes = 1;
        if (!read_header(png_, info_, passes)) failed();
        const uint64_t w = png_get_image_width(png_, info_), h = png_get_image_height(png_, info_);
        check_dimensions(w, h);
        width = static_cast<uint32_t>(w);
        height = static_cast<uint32_t>(h);
        channels_ = png_get_channels(png_, info_);
        layout = channels_ >= 3 ? Layout::Rgb : Layout::Grey;
        description = "PNG";
        const size_t bytes = png_get_rowbytes(png_, info_);
        if (bytes != static_cast<size_t>(width) * channels_) fail("PNG rows of unexpected size");
        if (passes == 1) {
            row_.resize(bytes);
            return;
        }
        // 64-bit product: on a 32-bit build a large image must fail here, not wrap.
        if (static_cast<uint64_t>(bytes) * height > SIZE_MAX / 2)
            fail("interlaced PNG too large to hold in memory (interlaced images are read whole)");
        whole_.resize(bytes * height);
        std::vector<uint8_t*> rows(height);
        for (uint32_t y = 0; y < height; ++y) rows[y] = whole_.data() + static_cast<size_t>(y) * bytes;
        if (!read_image(png_, rows.data())) failed();
    }

    void read_rows(uint8_t* dst, uint32_t count) override {
        const size_t bytes = static_cast<size_t>(width) * channels_;
        for (uint32_t r = 0; r < count; ++r, ++next_row_) {
            const uint8_t* src = row_.data();
            if (!whole_.empty()) {
                src = whole_.data() + static_cast<size_t>(next_row_) * bytes;
            } else if (!read_row(png_, row_.data())) {
                failed();
            }
            dst = compose(src, dst);
        }
    }

private:
    [[noreturn]] void failed() { fail(std::string("not a valid PNG: ") + state_.message); }

    // Copies one row, laying transparent pixels on the background; returns
    // the end of the written row.
    uint8_t* compose(const uint8_t* src, uint8_t* dst) const {
        switch (channels_) {
            case 4:
                for (uint32_t x = 0; x < width; ++x, src += 4, dst += 3)
                    for (int c = 0; c < 3; ++c) dst[c] = over(src[c], src[3], background_[c]);
                return dst;
            case 2: {
                const uint32_t grey = (77 * background_[0] + 150 * background_[1] + 29 * background_[2] + 128) >> 8;
                for (uint32_t x = 0; x < width; ++x, src += 2) *dst++ = over(src[0], src[1], grey);
                return dst;
            }
            default:
                std::memcpy(dst, src, static_cast<size_t>(width) * channels_);
                return dst + static_cast<size_t>(width) * channels_;
        }
    }

    PngState state_;
    png_structp png_ = nullptr;
    png_infop info_ = nullptr;
    uint8_t background_[3];
    uint32_t channels_ = 3, next_row_ = 0;
    std::vector<uint8_t> row_, whole_;
};

}  // namespace

std::unique_ptr<Source> open_png(Input& in, const uint8_t background[3]) {
    auto source = std::make_unique<PngSource>(in, background);
    source->start();
    return source;
}

}  // namespace tool
