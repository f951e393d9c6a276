// Planar readers on real contexts: plane placement, repeated edges of the
// last bands, read positions after the image, and the interleaved V/U reader
// filling the same edge cells.
#include <TekoJEncoder.h>

#include "support/test_support.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <numeric>
#include <string>

namespace {

using tekoj_test::Bytes;

struct Planar {
    EncoderContext* ctx;
    Planar(const uint8_t* data, int w, int h, uint32_t format) {
        const ImageInfo info = tekoj_test::image_info(data, w, h, format);
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
    void next_band() {
        ++ctx->mcu_state->imcu_row;
        __eko_jpeg_enc_setup_imcu(ctx);
    }
    Bytes cells(int c, uint32_t r) const {
        const uint8_t* row = ctx->sample_rows->row_arrays[c][r];
        return Bytes(row, row + ctx->comp_info[c].padded_width);
    }
};

// The first `n` values of `source` followed by its last one up to `total`.
Bytes repeated(const uint8_t* source, size_t n, size_t total) {
    Bytes b(total);
    for (size_t i = 0; i < total; ++i) b[i] = source[std::min(i, n - 1)];
    return b;
}

Bytes counting(size_t n) {
    Bytes b(n);
    std::iota(b.begin(), b.end(), uint8_t{1});
    return b;
}

}  // namespace

TEST(PlanarReaders, LastBandsRepeatTheLastColumnAndRow) {
    struct Case {
        uint32_t format;
        int w, h;
    };
    // Grey 17x1; 4:2:0 of height 20 (second band: 4 luma, 2 chroma rows);
    // width 17 (9 chroma samples); height 32 (no row repeated); 5x3.
    const Case cases[] = {{EKO_FORMAT_GREY, 17, 1}, {EKO_FORMAT_YUV420, 17, 20}, {EKO_FORMAT_YUV420, 40, 32},
                          {EKO_FORMAT_GREY, 3, 13}, {EKO_FORMAT_YUV420, 5, 3}};
    for (const Case& c : cases) {
        SCOPED_TRACE("format " + std::to_string(c.format) + " " + std::to_string(c.w) + "x" + std::to_string(c.h));
        const Bytes image = counting(tekoj_test::image_size(c.format, c.w, c.h));
        Planar p(image.data(), c.w, c.h, c.format);
        const uint8_t* plane_start[3] = {p.ctx->plane_y, p.ctx->plane_u, p.ctx->plane_v};
        if (c.w == 5) {  // U 15 bytes after the data, V 21 bytes after it
            EXPECT_EQ(plane_start[1], image.data() + 15);
            EXPECT_EQ(plane_start[2], image.data() + 21);
        }
        for (uint32_t b = 0; b < p.ctx->total_imcu_rows; ++b) {
            if (b > 0) p.next_band();
            const uint8_t* before[3] = {p.ctx->plane_y, p.ctx->plane_u, p.ctx->plane_v};
            __eko_jpeg_enc_get_raw_data(p.ctx);
            for (int comp = 0; comp < p.ctx->num_components; ++comp) {
                const ComponentInfo& ci = p.ctx->comp_info[comp];
                for (uint32_t r = 0; r < ci.band_rows; ++r) {
                    const uint32_t source_row = std::min(r, ci.rows_this_band - 1);
                    EXPECT_EQ(p.cells(comp, r),
                              repeated(before[comp] + source_row * ci.downsampled_width, ci.downsampled_width, ci.padded_width))
                        << "band " << b << " component " << comp << " row " << r;
                }
            }
        }
        // Read positions end after the image's planes.
        const uint8_t* const planes_end[3] = {plane_start[1] == nullptr ? image.data() + image.size() : plane_start[1],
                                               plane_start[2], image.data() + image.size()};
        for (int comp = 0; comp < p.ctx->num_components; ++comp) {
            const uint8_t* pos[3] = {p.ctx->plane_y, p.ctx->plane_u, p.ctx->plane_v};
            EXPECT_EQ(pos[comp], planes_end[comp]) << comp;
        }
        if (c.h == 20) {
            EXPECT_EQ(p.ctx->comp_info[0].rows_this_band, 4u);
            EXPECT_EQ(p.ctx->comp_info[1].rows_this_band, 2u);
        }
    }
}

TEST(PlanarReaders, InterleavedVuReaderFillsTheSameEdgeCells) {
    // 5 x 3: Y plane, then rows of (V, U) pairs.
    const Bytes y = counting(15);
    const Bytes vu = {101, 201, 102, 202, 103, 203, 104, 204, 105, 205, 106, 206};
    Planar p(y.data(), 5, 3, EKO_FORMAT_YUV420);
    p.ctx->plane_y = y.data();
    p.ctx->plane_v = vu.data();
    EXPECT_EQ(__eko_jpeg_enc_get_raw_pvu_data(p.ctx), 1u);
    for (uint32_t r = 0; r < 16; ++r) EXPECT_EQ(p.cells(0, r), repeated(y.data() + 5 * std::min(r, 2u), 5, 8)) << r;
    const Bytes cb_last = {204, 205, 206}, cr_last = {104, 105, 106};
    EXPECT_EQ(p.cells(1, 0), repeated(Bytes{201, 202, 203}.data(), 3, 8));
    EXPECT_EQ(p.cells(2, 0), repeated(Bytes{101, 102, 103}.data(), 3, 8));
    for (uint32_t r = 1; r < 8; ++r) {
        EXPECT_EQ(p.cells(1, r), repeated(cb_last.data(), 3, 8)) << r;
        EXPECT_EQ(p.cells(2, r), repeated(cr_last.data(), 3, 8)) << r;
    }
    EXPECT_EQ(p.ctx->plane_v, vu.data() + vu.size());
}
