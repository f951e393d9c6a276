// RGB input: converts one band of RGB pixels to Y, Cb and Cr sample rows with
// 2x2 chroma subsampling. RGB565 averages each 2x2 block; the byte layouts
// take the chroma of the block's upper-left pixel.
#include "input/edge_fill.h"
#include "input/pixel_kernels.h"
#include "input/readers.h"

#include <cstddef>

namespace tekoj {
namespace {

struct BandRows {
    uint8_t* const* y;
    uint8_t* const* cb;
    uint8_t* const* cr;
    const ComponentInfo* cy;
    const ComponentInfo* cc;
};

inline BandRows band_rows(EncoderContext* ctx) {
    SampleRowSet* s = ctx->sample_rows;
    return {s->row_arrays[0], s->row_arrays[1], s->row_arrays[2], &ctx->comp_info[0], &ctx->comp_info[1]};
}

// Repeats the last written column of every written row and the last written
// row down to the end of the band, for luma and both chroma components.
inline void finish_band(const BandRows& b, uint32_t y_cols, uint32_t y_rows, uint32_t c_cols, uint32_t c_rows) {
    fill_component_edges(b.y, *b.cy, y_cols, y_rows);
    fill_component_edges(b.cb, *b.cc, c_cols, c_rows);
    fill_component_edges(b.cr, *b.cc, c_cols, c_rows);
}

void read_picking(EncoderContext* ctx, PickLayout layout, uint32_t bpp) {
    const BandRows b = band_rows(ctx);
    const InputKernels& k = input_kernels();
    const auto upper = k.pick_upper[layout];
    const auto lower = k.pick_lower[layout];
    const uint32_t w = static_cast<uint32_t>(ctx->width);
    const uint32_t rows = b.cy->rows_this_band;
    const size_t stride = static_cast<size_t>(w) * bpp;
    const uint8_t* src = ctx->read_ptr;
    uint32_t pairs = 0;
    for (uint32_t p = 0; 2 * p < rows; ++p, ++pairs) {
        upper(src, w, b.y[2 * p], b.cb[p], b.cr[p]);
        src += stride;
        if (2 * p + 1 < rows) {
            lower(src, w, b.y[2 * p + 1]);
            src += stride;
        }
    }
    ctx->read_ptr = src;
    finish_band(b, w, rows, (w >> 1) + (w & 1), pairs);
}

void read_rgb565(EncoderContext* ctx) {
    const BandRows b = band_rows(ctx);
    const auto blocks = input_kernels().rgb565_blocks;
    const uint32_t w = static_cast<uint32_t>(ctx->width);
    const uint32_t rows = b.cy->rows_this_band;
    const size_t stride = static_cast<size_t>(w) * 2;
    const uint8_t* band = ctx->read_ptr;
    // An image one pixel wide has no column pair: its column pairs with itself.
    const uint32_t we = w == 1 ? 2 : (w & ~1u);
    uint32_t pairs = 0;
    for (uint32_t p = 0; 2 * p < rows; ++p, ++pairs) {
        const uint8_t* upper = band + 2 * p * stride;
        const uint8_t* lower = (2 * p + 1 < rows) ? upper + stride : upper;
        if (w == 1) {
            const uint8_t u[4] = {upper[0], upper[1], upper[0], upper[1]};
            const uint8_t l[4] = {lower[0], lower[1], lower[0], lower[1]};
            blocks(u, l, 1, b.y[2 * p], b.y[2 * p + 1], b.cb[p], b.cr[p]);
        } else {
            blocks(upper, lower, we / 2, b.y[2 * p], b.y[2 * p + 1], b.cb[p], b.cr[p]);
        }
        for (uint32_t r = 2 * p; r < 2 * p + 2; ++r) fill_right(b.y[r], we, b.cy->padded_width);
        fill_right(b.cb[p], we / 2, b.cc->padded_width);
        fill_right(b.cr[p], we / 2, b.cc->padded_width);
    }
    ctx->read_ptr = band + rows * stride;
    fill_rows_below(b.y, 2 * pairs, b.cy->band_rows, b.cy->padded_width);
    fill_rows_below(b.cb, pairs, b.cc->band_rows, b.cc->padded_width);
    fill_rows_below(b.cr, pairs, b.cc->band_rows, b.cc->padded_width);
}

}  // namespace
}  // namespace tekoj

extern "C" {

EKO_API uint32_t __eko_jpeg_enc_get_raw_rgb565_data(EncoderContext* context) {
    tekoj::read_rgb565(context);
    return 1;
}

EKO_API uint32_t __eko_jpeg_enc_get_raw_rgb888_data(EncoderContext* context) {
    tekoj::read_picking(context, tekoj::kRgb888, 3);
    return 1;
}

EKO_API uint32_t __eko_jpeg_enc_get_raw_rgba8888_data(EncoderContext* context) {
    tekoj::read_picking(context, tekoj::kRgba8888, 4);
    return 1;
}

EKO_API uint32_t __eko_jpeg_enc_get_raw_bgra8888_data(EncoderContext* context) {
    tekoj::read_picking(context, tekoj::kBgra8888, 4);
    return 1;
}

}  // extern "C"
