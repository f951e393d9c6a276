// Band readers on real contexts: every cell the transform reads beyond the
// written ones repeats the last written column and row (no stale or
// uninitialised bytes), for the planar, interleaved V/U and RGB readers. The
// conversions themselves are pinned by the golden streams.
#include <TekoJEncoderInternal.h>

#include "support/test_support.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <numeric>
#include <string>
#include <utility>

using namespace tekoj_test;

namespace {

// The first `n` values of `source` followed by its last one up to `total`.
Bytes repeated(const uint8_t* source, size_t n, size_t total) {
    Bytes b(total);
    for (size_t i = 0; i < total; ++i) b[i] = source[std::min(i, n - 1)];
    return b;
}

// Reads every band of the image with `read`, and checks the last band's rows:
// `cols` and `rows` (per component) were written, the rest repeats them.
template <typename Read, typename Written>
void expect_edges_repeated(const ImageInfo& info, Read read, Written written) {
    Context c(info);
    ASSERT_NE(c.ctx, nullptr);
    c.mark_band_rows();
    for (uint32_t b = 0; b < c->total_imcu_rows; ++b) {
        if (b > 0) ++c->mcu_state->imcu_row, __eko_jpeg_enc_setup_imcu(c.ctx);
        read(c.ctx);
    }
    for (int comp = 0; comp < c->num_components; ++comp) {
        const auto [cols, rows] = written(c.ctx, comp);
        for (uint32_t r = 0; r < c->comp_info[comp].band_rows; ++r)
            ASSERT_EQ(c.cells(comp, r), repeated(c->sample_rows->row_arrays[comp][std::min(r, rows - 1)], cols,
                                                 c->comp_info[comp].padded_width)) << comp << " " << r;
    }
}

}  // namespace

TEST(PlanarReaders, LastBandsRepeatTheLastColumnAndRow) {
    // Grey 17x1 and 3x13; 4:2:0 of height 20 (second band: 4 luma, 2 chroma
    // rows) and 5x3. The written rows must hold the plane's own samples.
    const struct { uint32_t format; int w, h; } cases[] = {
        {EKO_FORMAT_GREY, 17, 1}, {EKO_FORMAT_GREY, 3, 13}, {EKO_FORMAT_YUV420, 17, 20}, {EKO_FORMAT_YUV420, 5, 3}};
    for (const auto& c : cases) {
        SCOPED_TRACE("format " + std::to_string(c.format) + " " + std::to_string(c.w) + "x" + std::to_string(c.h));
        Bytes image(image_size(c.format, c.w, c.h));
        std::iota(image.begin(), image.end(), uint8_t{1});
        const uint8_t* planes[3] = {};
        expect_edges_repeated(
            image_info(image.data(), c.w, c.h, c.format),
            [&](EncoderContext* ctx) {
                planes[0] = ctx->plane_y, planes[1] = ctx->plane_u, planes[2] = ctx->plane_v;
                __eko_jpeg_enc_get_raw_data(ctx);
            },
            [&](EncoderContext* ctx, int comp) {
                const ComponentInfo& ci = ctx->comp_info[comp];
                for (uint32_t r = 0; r < ci.rows_this_band; ++r)
                    EXPECT_EQ(Bytes(ctx->sample_rows->row_arrays[comp][r], ctx->sample_rows->row_arrays[comp][r] +
                                                                               ci.downsampled_width),
                              Bytes(planes[comp] + r * ci.downsampled_width, planes[comp] + (r + 1) * ci.downsampled_width));
                return std::pair<uint32_t, uint32_t>{ci.downsampled_width, ci.rows_this_band};
            });
    }
}

TEST(PlanarReaders, InterleavedVuReaderFillsTheSameEdgeCells) {
    // 5 x 3: Y plane, then rows of (V, U) pairs.
    Bytes y(15);
    std::iota(y.begin(), y.end(), uint8_t{1});
    const Bytes vu = {101, 201, 102, 202, 103, 203, 104, 204, 105, 205, 106, 206};
    Context p(image_info(y.data(), 5, 3, EKO_FORMAT_YUV420));
    p.mark_band_rows();
    p->plane_y = y.data();
    p->plane_v = vu.data();
    EXPECT_EQ(__eko_jpeg_enc_get_raw_pvu_data(p.ctx), 1u);
    for (uint32_t r = 0; r < 16; ++r) EXPECT_EQ(p.cells(0, r), repeated(y.data() + 5 * std::min(r, 2u), 5, 8)) << r;
    const uint8_t cb[2][3] = {{201, 202, 203}, {204, 205, 206}}, cr[2][3] = {{101, 102, 103}, {104, 105, 106}};
    for (int c = 1; c < 3; ++c)  // Cb from the U bytes, Cr from the V bytes
        for (uint32_t r = 0; r < 8; ++r) EXPECT_EQ(p.cells(c, r), repeated((c == 1 ? cb : cr)[r > 0], 3, 8)) << c << r;
    EXPECT_EQ(p->plane_v, vu.data() + vu.size());
}

TEST(RgbReaders, CellsBeyondTheWrittenOnesRepeatTheLastColumnAndRow) {
    const std::pair<uint32_t, uint32_t (*)(EncoderContext*)> readers[] = {
        {EKO_FORMAT_RGB565, __eko_jpeg_enc_get_raw_rgb565_data}, {EKO_FORMAT_RGB888, __eko_jpeg_enc_get_raw_rgb888_data},
        {EKO_FORMAT_RGBA8888, __eko_jpeg_enc_get_raw_rgba8888_data}, {EKO_FORMAT_BGRA8888, __eko_jpeg_enc_get_raw_bgra8888_data}};
    for (const auto& reader : readers)
        for (int w : {1, 2, 5, 17, 32})
            for (int h : {1, 3, 16, 17, 30}) {
                const uint32_t f = reader.first;
                SCOPED_TRACE("format " + std::to_string(f) + " " + std::to_string(w) + "x" + std::to_string(h));
                const Bytes image = rgb_to_format(photo_rgb(w, h, 3), w, h, f);
                // RGB565 converts column pairs (a width of 1 pairs with
                // itself) and doubles an odd last row.
                expect_edges_repeated(image_info(image.data(), w, h, f), reader.second, [&](EncoderContext* ctx, int c) {
                    const uint32_t n = ctx->comp_info[0].rows_this_band, pairs = (n + 1) / 2;
                    const bool averaging = f == EKO_FORMAT_RGB565;
                    const uint32_t y_cols = averaging ? (w == 1 ? 2 : w & ~1) : w, y_rows = averaging ? 2 * pairs : n;
                    if (w == 1 && averaging) { EXPECT_EQ(ctx->sample_rows->row_arrays[0][0][0], ctx->sample_rows->row_arrays[0][0][1]); }
                    return c ? std::pair<uint32_t, uint32_t>{averaging ? y_cols / 2 : (w + 1) / 2, pairs}
                             : std::pair<uint32_t, uint32_t>{y_cols, y_rows};
                });
            }
}

TEST(PlanarReaders, BandsReadInPlaceCodeAsTheCopyingReaderDoes) {
    // Widths that fill whole blocks are read where they lie (a last band
    // short of rows, or a width past a block edge, is copied): the stream
    // must equal one made band by band through the copying reader, and the
    // caller's planes (exact-size blocks, so an over-read shows under the
    // sanitizer) stay as they were.
    const struct { uint32_t format; int w, h; } cases[] = {
        {EKO_FORMAT_GREY, 16, 8}, {EKO_FORMAT_GREY, 48, 20}, {EKO_FORMAT_YUV420, 16, 16},
        {EKO_FORMAT_YUV420, 64, 40}, {EKO_FORMAT_YUV420, 40, 32}, {EKO_FORMAT_YUV420, 24, 16}};
    for (const auto& c : cases) {
        SCOPED_TRACE("format " + std::to_string(c.format) + " " + std::to_string(c.w) + "x" + std::to_string(c.h));
        const Bytes rgb = photo_rgb(c.w, c.h, 5);
        const Bytes image = c.format == EKO_FORMAT_GREY ? rgb_to_grey(rgb, c.w, c.h) : rgb_to_yuv420(rgb, c.w, c.h);
        const Bytes kept = image;
        const Bytes direct = encode_to_memory(image_info(image.data(), c.w, c.h, c.format), 75);
        Context s(image_info(image.data(), c.w, c.h, c.format));
        ASSERT_NE(s.ctx, nullptr);
        ASSERT_EQ(__eko_jpeg_enc_make_header(s.ctx), 1u);
        for (uint32_t b = 0; b < s->total_imcu_rows; ++b) {
            __eko_jpeg_enc_get_raw_data(s.ctx);
            ASSERT_EQ(__eko_jpeg_enc_compress_data(s.ctx, s->sample_rows->row_arrays), 1u);
        }
        ASSERT_EQ(__eko_jpeg_enc_make_end_mark(s.ctx), 1u);
        EXPECT_EQ(without_date(direct), without_date(Bytes(s->output->buffer, s->output->buffer + s->output->total)));
        EXPECT_EQ(image, kept);
    }
}
