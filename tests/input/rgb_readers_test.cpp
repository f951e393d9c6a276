// RGB readers on real contexts: every cell the transform reads beyond the
// written ones repeats the last written column and row (no stale or
// uninitialised bytes), RGB565 of width 1 included. The conversions
// themselves are pinned by the golden streams.
#include <TekoJEncoderInternal.h>

#include "support/test_support.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <utility>

using namespace tekoj_test;

TEST(RgbReaders, CellsBeyondTheWrittenOnesRepeatTheLastColumnAndRow) {
    const std::pair<uint32_t, uint32_t (*)(EncoderContext*)> readers[] = {
        {EKO_FORMAT_RGB565, __eko_jpeg_enc_get_raw_rgb565_data}, {EKO_FORMAT_RGB888, __eko_jpeg_enc_get_raw_rgb888_data},
        {EKO_FORMAT_RGBA8888, __eko_jpeg_enc_get_raw_rgba8888_data}, {EKO_FORMAT_BGRA8888, __eko_jpeg_enc_get_raw_bgra8888_data}};
    const EncodeOptions options{75, nullptr, 0};
    for (const auto& [f, read] : readers) {
        for (int w : {1, 2, 5, 17, 32}) {
            for (int h : {1, 3, 16, 17, 30}) {
                SCOPED_TRACE("format " + std::to_string(f) + " " + std::to_string(w) + "x" + std::to_string(h));
                const Bytes image = rgb_to_format(photo_rgb(w, h, 3), w, h, f);
                const ImageInfo info = image_info(image.data(), w, h, f);
                const OutputRequest out{EKO_OUTPUT_MEMORY, nullptr, static_cast<uint8_t*>(DORVATEKO_OsMalloc(4096)), 4096};
                EncoderContext* ctx = __eko_jpeg_enc_initiaize(&info, &out, &options, nullptr);
                ASSERT_NE(ctx, nullptr);
                uint8_t*** const rows = ctx->sample_rows->row_arrays;
                for (int c = 0; c < 3; ++c)  // 0xEE shows cells left unwritten
                    for (uint32_t r = 0; r < ctx->comp_info[c].band_rows; ++r)
                        std::memset(rows[c][r], 0xEE, ctx->comp_info[c].padded_width);
                const uint32_t bands = static_cast<uint32_t>(h + 15) / 16;
                for (uint32_t b = 0; b < bands; ++b) {
                    if (b > 0) ++ctx->mcu_state->imcu_row, __eko_jpeg_enc_setup_imcu(ctx);
                    read(ctx);
                }
                // Written cells of the last band: RGB565 converts column pairs
                // (a width of 1 pairs with itself) and doubles an odd last row.
                const uint32_t n = ctx->comp_info[0].rows_this_band, pairs = (n + 1) / 2;
                const bool averaging = f == EKO_FORMAT_RGB565;
                const uint32_t y_cols = averaging ? (w == 1 ? 2 : w & ~1) : w, y_rows = averaging ? 2 * pairs : n;
                const uint32_t c_cols = averaging ? y_cols / 2 : (w + 1) / 2;
                for (int c = 0; c < 3; ++c) {
                    const uint32_t cols = c ? c_cols : y_cols, written = c ? pairs : y_rows;
                    for (uint32_t r = 0; r < ctx->comp_info[c].band_rows; ++r) {
                        const uint8_t* source = rows[c][r < written ? r : written - 1];
                        for (uint32_t x = 0; x < ctx->comp_info[c].padded_width; ++x)
                            ASSERT_EQ(rows[c][r][x], source[x < cols ? x : cols - 1]) << c << " " << r << " " << x;
                    }
                }
                if (w == 1 && averaging) { EXPECT_EQ(rows[0][0][0], rows[0][0][1]); }
                DORVATEKO_OsFree(ctx->output->buffer);
                __eko_jpeg_enc_release_mem(ctx);
                DORVATEKO_OsFree(ctx);
            }
        }
    }
}
