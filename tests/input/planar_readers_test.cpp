// Planar readers on real contexts: repeated edges of the last bands, and the
// interleaved V/U reader filling the same edge cells.
#include <TekoJEncoderInternal.h>

#include "support/test_support.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <numeric>
#include <string>

using namespace tekoj_test;

namespace {

// A context whose band rows start as 0xEE so that unwritten cells show.
struct Planar {
    EncoderContext* ctx;
    Planar(const uint8_t* data, int w, int h, uint32_t format) {
        const ImageInfo info = image_info(data, w, h, format);
        const OutputRequest out{EKO_OUTPUT_MEMORY, nullptr, static_cast<uint8_t*>(DORVATEKO_OsMalloc(4096)), 4096};
        const EncodeOptions options{75, nullptr, 0};
        ctx = __eko_jpeg_enc_initiaize(&info, &out, &options, nullptr);
        for (int c = 0; c < ctx->num_components; ++c)
            for (uint32_t r = 0; r < ctx->comp_info[c].band_rows; ++r)
                std::memset(ctx->sample_rows->row_arrays[c][r], 0xEE, ctx->comp_info[c].padded_width);
    }
    ~Planar() {
        DORVATEKO_OsFree(ctx->output->buffer);
        __eko_jpeg_enc_release_mem(ctx);
        DORVATEKO_OsFree(ctx);
    }
    Bytes cells(int c, uint32_t r) const {
        return Bytes(ctx->sample_rows->row_arrays[c][r], ctx->sample_rows->row_arrays[c][r] + ctx->comp_info[c].padded_width);
    }
};

// The first `n` values of `source` followed by its last one up to `total`.
Bytes repeated(const uint8_t* source, size_t n, size_t total) {
    Bytes b(total);
    for (size_t i = 0; i < total; ++i) b[i] = source[std::min(i, n - 1)];
    return b;
}

}  // namespace

TEST(PlanarReaders, LastBandsRepeatTheLastColumnAndRow) {
    // Grey 17x1 and 3x13; 4:2:0 of height 20 (second band: 4 luma, 2 chroma
    // rows) and 5x3.
    const struct { uint32_t format; int w, h; } cases[] = {
        {EKO_FORMAT_GREY, 17, 1}, {EKO_FORMAT_GREY, 3, 13}, {EKO_FORMAT_YUV420, 17, 20}, {EKO_FORMAT_YUV420, 5, 3}};
    for (const auto& c : cases) {
        SCOPED_TRACE("format " + std::to_string(c.format) + " " + std::to_string(c.w) + "x" + std::to_string(c.h));
        Bytes image(image_size(c.format, c.w, c.h));
        std::iota(image.begin(), image.end(), uint8_t{1});
        Planar p(image.data(), c.w, c.h, c.format);
        for (uint32_t b = 0; b < p.ctx->total_imcu_rows; ++b) {
            if (b > 0) ++p.ctx->mcu_state->imcu_row, __eko_jpeg_enc_setup_imcu(p.ctx);
            const uint8_t* before[3] = {p.ctx->plane_y, p.ctx->plane_u, p.ctx->plane_v};
            __eko_jpeg_enc_get_raw_data(p.ctx);
            for (int comp = 0; comp < p.ctx->num_components; ++comp) {
                const ComponentInfo& ci = p.ctx->comp_info[comp];
                for (uint32_t r = 0; r < ci.band_rows; ++r) {
                    const uint8_t* source = before[comp] + std::min(r, ci.rows_this_band - 1) * ci.downsampled_width;
                    EXPECT_EQ(p.cells(comp, r), repeated(source, ci.downsampled_width, ci.padded_width))
                        << b << " " << comp << " " << r;
                }
            }
        }
    }
}

TEST(PlanarReaders, InterleavedVuReaderFillsTheSameEdgeCells) {
    // 5 x 3: Y plane, then rows of (V, U) pairs.
    Bytes y(15);
    std::iota(y.begin(), y.end(), uint8_t{1});
    const Bytes vu = {101, 201, 102, 202, 103, 203, 104, 204, 105, 205, 106, 206};
    Planar p(y.data(), 5, 3, EKO_FORMAT_YUV420);
    p.ctx->plane_y = y.data();
    p.ctx->plane_v = vu.data();
    EXPECT_EQ(__eko_jpeg_enc_get_raw_pvu_data(p.ctx), 1u);
    for (uint32_t r = 0; r < 16; ++r) EXPECT_EQ(p.cells(0, r), repeated(y.data() + 5 * std::min(r, 2u), 5, 8)) << r;
    const uint8_t cb[2][3] = {{201, 202, 203}, {204, 205, 206}}, cr[2][3] = {{101, 102, 103}, {104, 105, 106}};
    for (int c = 1; c < 3; ++c)  // Cb from the U bytes, Cr from the V bytes
        for (uint32_t r = 0; r < 8; ++r) EXPECT_EQ(p.cells(c, r), repeated((c == 1 ? cb : cr)[r > 0], 3, 8)) << c << r;
    EXPECT_EQ(p.ctx->plane_v, vu.data() + vu.size());
}
