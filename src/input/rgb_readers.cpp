// RGB input: converts one band of RGB pixels to Y, Cb and Cr sample rows with
// 2x2 chroma subsampling. RGB565 averages each 2x2 block; the byte layouts
// take the chroma of the block's upper-left pixel.
#include "input/edge_fill.h"
#include "input/readers.h"

#include <cstddef>

namespace tekoj {
namespace {

// Fixed point with 12 fractional bits; the weights of each row sum to 4096
// (luma) or 0 (chroma), so no result leaves 0..255.
inline uint8_t luma(int32_t r, int32_t g, int32_t b) { return static_cast<uint8_t>((1225 * r + 2404 * g + 467 * b) >> 12); }
inline uint8_t chroma_b(int32_t r, int32_t g, int32_t b) {
    return static_cast<uint8_t>(128 + ((-691 * r - 1357 * g + 2048 * b) >> 12));
}
inline uint8_t chroma_r(int32_t r, int32_t g, int32_t b) {
    return static_cast<uint8_t>(128 + ((2048 * r - 1715 * g - 333 * b) >> 12));
}

// Byte layouts: offsets of R, G, B within a pixel and the pixel size.
template <int R, int G, int B, int Bpp>
struct ByteLayout {
    static constexpr int r = R, g = G, b = B, bpp = Bpp;
};
using Rgb888 = ByteLayout<0, 1, 2, 3>;
using Rgba8888 = ByteLayout<0, 1, 2, 4>;
using Bgra8888 = ByteLayout<2, 1, 0, 4>;

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

template <typename L>
void read_picking(EncoderContext* ctx) {
    const BandRows b = band_rows(ctx);
    const uint32_t w = static_cast<uint32_t>(ctx->width);
    const uint32_t rows = b.cy->rows_this_band;
    const size_t stride = static_cast<size_t>(w) * L::bpp;
    const uint8_t* src = ctx->read_ptr;
    uint32_t pairs = 0;
    for (uint32_t p = 0; 2 * p < rows; ++p, ++pairs) {
        uint8_t* yrow = b.y[2 * p];
        uint8_t* cbrow = b.cb[p];
        uint8_t* crrow = b.cr[p];
        const uint8_t* px = src;
        for (uint32_t k = 0; k < (w >> 1); ++k, px += 2 * L::bpp) {
            const int32_t r0 = px[L::r], g0 = px[L::g], b0 = px[L::b];
            yrow[2 * k] = luma(r0, g0, b0);
            yrow[2 * k + 1] = luma(px[L::bpp + L::r], px[L::bpp + L::g], px[L::bpp + L::b]);
            cbrow[k] = chroma_b(r0, g0, b0);
            crrow[k] = chroma_r(r0, g0, b0);
        }
        if (w & 1) {
            const int32_t r0 = px[L::r], g0 = px[L::g], b0 = px[L::b];
            yrow[w - 1] = luma(r0, g0, b0);
            cbrow[w >> 1] = chroma_b(r0, g0, b0);
            crrow[w >> 1] = chroma_r(r0, g0, b0);
        }
        src += stride;
        if (2 * p + 1 < rows) {
            uint8_t* lower = b.y[2 * p + 1];
            px = src;
            for (uint32_t x = 0; x < w; ++x, px += L::bpp) lower[x] = luma(px[L::r], px[L::g], px[L::b]);
            src += stride;
        }
    }
    ctx->read_ptr = src;
    finish_band(b, w, rows, (w >> 1) + (w & 1), pairs);
}

struct Rgb {
    int32_t r, g, b;
};

// Each 5- or 6-bit field moves to the top of a byte plus half a step.
inline Rgb expand565(const uint8_t* p) {
    const uint32_t v = static_cast<uint32_t>(p[0]) | (static_cast<uint32_t>(p[1]) << 8);
    return {static_cast<int32_t>(((v & 0xF800) >> 8) + 4), static_cast<int32_t>(((v & 0x07E0) >> 3) + 2),
            static_cast<int32_t>(((v << 3) & 0xFF) + 4)};
}

void read_rgb565(EncoderContext* ctx) {
    const BandRows b = band_rows(ctx);
    const uint32_t w = static_cast<uint32_t>(ctx->width);
    const uint32_t rows = b.cy->rows_this_band;
    const size_t stride = static_cast<size_t>(w) * 2;
    const uint8_t* band = ctx->read_ptr;
    // An image one pixel wide has no column pair: its column pairs with itself.
    const uint32_t we = w == 1 ? 2 : (w & ~1u);
    const uint32_t step = w == 1 ? 0 : 2;
    uint32_t pairs = 0;
    for (uint32_t p = 0; 2 * p < rows; ++p, ++pairs) {
        const uint8_t* upper = band + 2 * p * stride;
        const uint8_t* lower = (2 * p + 1 < rows) ? upper + stride : upper;
        uint8_t* y0 = b.y[2 * p];
        uint8_t* y1 = b.y[2 * p + 1];
        for (uint32_t x = 0; x < we; x += 2) {
            const uint8_t* u = upper + 2 * static_cast<size_t>(x);
            const uint8_t* l = lower + 2 * static_cast<size_t>(x);
            const Rgb a = expand565(u), c = expand565(u + step), d = expand565(l), e = expand565(l + step);
            y0[x] = luma(a.r, a.g, a.b);
            y0[x + 1] = luma(c.r, c.g, c.b);
            y1[x] = luma(d.r, d.g, d.b);
            y1[x + 1] = luma(e.r, e.g, e.b);
            const int32_t ra = (a.r + c.r + d.r + e.r) >> 2;
            const int32_t ga = (a.g + c.g + d.g + e.g + 2) >> 2;
            const int32_t ba = (a.b + c.b + d.b + e.b) >> 2;
            b.cb[p][x >> 1] = chroma_b(ra, ga, ba);
            b.cr[p][x >> 1] = chroma_r(ra, ga, ba);
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
    tekoj::read_picking<tekoj::Rgb888>(context);
    return 1;
}

EKO_API uint32_t __eko_jpeg_enc_get_raw_rgba8888_data(EncoderContext* context) {
    tekoj::read_picking<tekoj::Rgba8888>(context);
    return 1;
}

EKO_API uint32_t __eko_jpeg_enc_get_raw_bgra8888_data(EncoderContext* context) {
    tekoj::read_picking<tekoj::Bgra8888>(context);
    return 1;
}

}  // extern "C"
