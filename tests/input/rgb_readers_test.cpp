// RGB readers on real contexts: the defined colour conversions, chroma taken
// from the upper-left pixel, and every cell the transform reads beyond the
// written ones repeating the last written column and row (no stale or
// uninitialised bytes), RGB565 of width 1 included.
#include <TekoJEncoder.h>

#include "support/test_support.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>

namespace {

using tekoj_test::Bytes;

// A context for a w x h image; band rows start as 0xEE so unwritten cells show.
struct Reader {
    EncoderContext* ctx;
    const uint8_t* data;
    Reader(const uint8_t* pixels, int w, int h, uint32_t format) : data(pixels) {
        const ImageInfo info = tekoj_test::image_info(pixels, w, h, format);
        const OutputRequest out{EKO_OUTPUT_MEMORY, nullptr, static_cast<uint8_t*>(DORVATEKO_OsMalloc(4096)), 4096};
        const EncodeOptions options{75, nullptr, 0};
        ctx = __eko_jpeg_enc_initiaize(&info, &out, &options, nullptr);
        for (int c = 0; c < 3; ++c)
            for (uint32_t r = 0; r < ctx->comp_info[c].band_rows; ++r)
                std::memset(ctx->sample_rows->row_arrays[c][r], 0xEE, ctx->comp_info[c].padded_width);
    }
    ~Reader() {
        DORVATEKO_OsFree(ctx->output->buffer);
        __eko_jpeg_enc_release_mem(ctx);
        DORVATEKO_OsFree(ctx);
    }
    void read() {
        switch (ctx->format) {
            case EKO_FORMAT_RGB565: __eko_jpeg_enc_get_raw_rgb565_data(ctx); break;
            case EKO_FORMAT_RGB888: __eko_jpeg_enc_get_raw_rgb888_data(ctx); break;
            case EKO_FORMAT_RGBA8888: __eko_jpeg_enc_get_raw_rgba8888_data(ctx); break;
            default: __eko_jpeg_enc_get_raw_bgra8888_data(ctx); break;
        }
    }
    void next_band() {
        ++ctx->mcu_state->imcu_row;
        __eko_jpeg_enc_setup_imcu(ctx);
    }
    const uint8_t* row(int c, uint32_t r) const { return ctx->sample_rows->row_arrays[c][r]; }
};

// One pixel in the byte layout of a format.
Bytes pixel(uint32_t format, uint8_t r, uint8_t g, uint8_t b) {
    return tekoj_test::rgb_to_format(Bytes{r, g, b}, 1, 1, format);
}

constexpr uint32_t kPicking[] = {EKO_FORMAT_RGB888, EKO_FORMAT_RGBA8888, EKO_FORMAT_BGRA8888};

}  // namespace

TEST(RgbReaders, DefinedColourConversions) {
    struct Case {
        uint32_t format;
        Bytes px;
        int width;
        uint8_t y, cb, cr;
    };
    std::vector<Case> cases = {
        {EKO_FORMAT_RGB565, {0xFF, 0xFF}, 2, 253, 127, 127}, {EKO_FORMAT_RGB565, {0x00, 0x00}, 2, 2, 128, 128},
        {EKO_FORMAT_RGB565, {0x00, 0xF8}, 2, 76, 86, 252},   {EKO_FORMAT_RGB565, {0x00, 0xF8}, 1, 76, 86, 252},
        {EKO_FORMAT_RGB565, {0xFF, 0xFF}, 1, 253, 127, 127},
    };
    for (uint32_t f : kPicking) {
        const struct {
            uint8_t r, g, b, y, cb, cr;
        } colours[] = {{255, 0, 0, 76, 84, 255},      {0, 255, 0, 149, 43, 21}, {0, 0, 255, 29, 255, 107},
                       {255, 255, 255, 255, 128, 128}, {0, 0, 0, 0, 128, 128}};
        for (const auto& c : colours) cases.push_back({f, pixel(f, c.r, c.g, c.b), 2, c.y, c.cb, c.cr});
        cases.push_back({f, pixel(f, 255, 0, 0), 1, 76, 84, 255});
    }
    for (const Case& c : cases) {
        SCOPED_TRACE("format " + std::to_string(c.format) + " width " + std::to_string(c.width) + " Y " +
                     std::to_string(c.y));
        Bytes image;
        for (int i = 0; i < 2 * c.width; ++i) image.insert(image.end(), c.px.begin(), c.px.end());
        Reader reader(image.data(), c.width, 2, c.format);
        reader.read();
        for (uint32_t x = 0; x < reader.ctx->comp_info[0].padded_width; ++x) {
            EXPECT_EQ(reader.row(0, 0)[x], c.y);
            EXPECT_EQ(reader.row(0, 15)[x], c.y);
        }
        EXPECT_EQ(reader.row(1, 7)[7], c.cb);
        EXPECT_EQ(reader.row(2, 7)[7], c.cr);
    }
}

TEST(RgbReaders, PickingReadersTakeChromaFromTheUpperLeftPixel) {
    // Width 3: chroma column 0 from pixel 0, column 1 from pixel 2; pixel 1
    // and the lower row give luma only.
    for (uint32_t f : kPicking) {
        SCOPED_TRACE(f);
        Bytes image;
        for (const auto& p : {pixel(f, 255, 0, 0), pixel(f, 0, 0, 255), pixel(f, 0, 255, 0), pixel(f, 0, 0, 255),
                              pixel(f, 0, 0, 255), pixel(f, 0, 0, 255)})
            image.insert(image.end(), p.begin(), p.end());
        Reader reader(image.data(), 3, 2, f);
        reader.read();
        EXPECT_EQ(Bytes(reader.row(0, 0), reader.row(0, 0) + 3), (Bytes{76, 29, 149}));
        EXPECT_EQ(Bytes(reader.row(0, 1), reader.row(0, 1) + 3), (Bytes{29, 29, 29}));
        EXPECT_EQ(Bytes(reader.row(1, 0), reader.row(1, 0) + 2), (Bytes{84, 43}));
        EXPECT_EQ(Bytes(reader.row(2, 0), reader.row(2, 0) + 2), (Bytes{255, 21}));
        EXPECT_EQ(reader.ctx->read_ptr, reader.data + image.size());
    }
}

TEST(RgbReaders, CellsBeyondTheWrittenOnesRepeatTheLastColumnAndRow) {
    const int widths[] = {1, 2, 5, 17, 32};
    const int heights[] = {1, 3, 16, 17, 30};
    for (uint32_t f : {EKO_FORMAT_RGB565, EKO_FORMAT_RGB888, EKO_FORMAT_RGBA8888, EKO_FORMAT_BGRA8888}) {
        for (int w : widths) {
            for (int h : heights) {
                SCOPED_TRACE("format " + std::to_string(f) + " " + std::to_string(w) + "x" + std::to_string(h));
                const Bytes image = tekoj_test::rgb_to_format(tekoj_test::photo_rgb(w, h, 3), w, h, f);
                Reader reader(image.data(), w, h, f);
                const uint32_t bands = static_cast<uint32_t>(h + 15) / 16;
                for (uint32_t b = 0; b < bands; ++b) {
                    if (b > 0) reader.next_band();
                    reader.read();
                    if (b == 0 && bands > 1) {
                        EXPECT_EQ(reader.ctx->read_ptr, image.data() + image.size() / h * 16);
                    }
                }
                // Written cells of the last band: RGB565 converts column pairs
                // (a width of 1 pairs with itself) and doubles an odd last row.
                const uint32_t rows = reader.ctx->comp_info[0].rows_this_band;
                const bool averaging = f == EKO_FORMAT_RGB565;
                const uint32_t pairs = (rows + 1) / 2;
                const uint32_t y_cols = averaging ? (w == 1 ? 2 : w & ~1) : w;
                const uint32_t y_rows = averaging ? 2 * pairs : rows;
                const uint32_t c_cols = averaging ? y_cols / 2 : (w + 1) / 2;
                for (int c = 0; c < 3; ++c) {
                    const ComponentInfo& comp = reader.ctx->comp_info[c];
                    const uint32_t cols = c ? c_cols : y_cols, written = c ? pairs : y_rows;
                    for (uint32_t r = 0; r < comp.band_rows; ++r) {
                        const uint8_t* row = reader.row(c, r);
                        const uint8_t* source = reader.row(c, r < written ? r : written - 1);
                        for (uint32_t x = 0; x < comp.padded_width; ++x)
                            ASSERT_EQ(row[x], source[x < cols ? x : cols - 1]) << "component " << c << " row " << r << " col " << x;
                    }
                }
                if (w == 1 && averaging) {
                    EXPECT_EQ(reader.row(0, 0)[0], reader.row(0, 0)[1]);
                }
            }
        }
    }
}
