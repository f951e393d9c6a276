// The packed 4:2:2 readers: band rows of the defined examples and edges on
// real contexts, and whole frames encoded through the exported coding steps
// and decoded by libjpeg-turbo.
#include <TekoJEncoder.h>

#include "support/fault_os_layer.h"
#include "support/test_support.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <memory>
#include <tuple>

namespace {

using tekoj_test::Bytes;

// A context coding a w x h packed frame 4:2:0, or 4:2:2 (Y 2x1) when keep422,
// to a memory block; band rows start as 0xEE so unwritten cells show.
struct PackedContext {
    EncoderSettings settings{};
    EncoderContext* ctx = nullptr;
    bool keep422;

    PackedContext(const uint8_t* data, int w, int h, bool keep) : keep422(keep) {
        ImageInfo info{w, h, data, 0, 0, 0, 0, 0, EKO_FORMAT_YUV420, nullptr};
        OutputRequest out{EKO_OUTPUT_MEMORY, nullptr, static_cast<uint8_t*>(DORVATEKO_OsMalloc(4096)), 4096};
        const EncodeOptions options{90, nullptr, 0};
        settings.num_components = 3;
        settings.num_quant_tables = 2;
        std::memset(settings.quant_tables, 3, sizeof settings.quant_tables);
        settings.write_dri = 1;
        const uint8_t specs[3][3] = {{0, 2, 1}, {1, 1, 1}, {1, 1, 1}};
        std::memcpy(settings.component_specs, specs, sizeof specs);
        ctx = __eko_jpeg_enc_initiaize(&info, &out, &options, keep ? &settings : nullptr);
        if (ctx == nullptr) {
            DORVATEKO_OsFree(out.buffer);
            return;
        }
        for (int c = 0; c < 3; ++c)
            for (uint32_t r = 0; r < ctx->comp_info[c].band_rows; ++r)
                std::memset(ctx->sample_rows->row_arrays[c][r], 0xEE, ctx->comp_info[c].padded_width);
    }
    ~PackedContext() {
        if (ctx == nullptr) return;
        uint8_t* buffer = ctx->output->buffer;
        __eko_jpeg_enc_release_mem(ctx);
        DORVATEKO_OsFree(ctx);
        DORVATEKO_OsFree(buffer);
    }
    uint32_t read() {
        return keep422 ? __eko_jpeg_enc_get_raw_duoview422_data_for_yuv422(ctx) : __eko_jpeg_enc_get_raw_duoview422_data(ctx);
    }
    // The cells of a band row that the transform reads.
    Bytes cells(int c, uint32_t r) const {
        const uint8_t* row = ctx->sample_rows->row_arrays[c][r];
        return Bytes(row, row + ctx->comp_info[c].padded_width);
    }
};

Bytes repeat(Bytes head, size_t total) {
    head.resize(total, head.back());
    return head;
}

TEST(Packed422Reader, DefinedExamplesWithRepeatedEdges) {
    // 4:2:2, width 4, one row: every cell right of and below the data repeats it.
    const uint8_t row[] = {10, 128, 20, 130, 30, 129, 40, 131};
    PackedContext f(row, 4, 1, true);
    ASSERT_EQ(f.read(), 1u);
    EXPECT_EQ(f.ctx->read_ptr, row + 8);
    EXPECT_EQ(f.cells(0, 7), repeat({10, 20, 30, 40}, 8));
    EXPECT_EQ(f.cells(1, 7), repeat({128, 129}, 8));
    EXPECT_EQ(f.cells(2, 7), repeat({130, 131}, 8));

    // 4:2:0, width 2, two rows: chroma of the upper row, 6 and 8 dropped.
    const uint8_t rows[] = {1, 2, 3, 4, 5, 6, 7, 8};
    PackedContext g(rows, 2, 2, false);
    ASSERT_EQ(g.read(), 1u);
    EXPECT_EQ(g.ctx->read_ptr, rows + 8);
    EXPECT_EQ(g.cells(0, 0), repeat({1, 3}, 8));
    EXPECT_EQ(g.cells(0, 15), repeat({5, 7}, 8));
    EXPECT_EQ(g.cells(1, 7), repeat({2}, 8));
    EXPECT_EQ(g.cells(2, 7), repeat({4}, 8));

    // Width 5: 8-byte rows; Y column 4 and chroma column 2 have no sample and
    // repeat the last written one.
    const uint8_t odd[] = {11, 21, 12, 31, 13, 22, 14, 32, 15, 23, 16, 33, 17, 24, 18, 34};
    PackedContext h(odd, 5, 2, true);
    ASSERT_EQ(h.read(), 1u);
    EXPECT_EQ(h.ctx->read_ptr, odd + 16);
    EXPECT_EQ(h.cells(0, 1), repeat({15, 16, 17, 18}, 8));
    EXPECT_EQ(h.cells(1, 1), repeat({23, 24}, 8));
    EXPECT_EQ(h.cells(2, 1), repeat({33, 34}, 8));
}

// Height 3 in 4:2:0: the band's second pair has only its upper row. Exactly
// three rows are read (the heap block ends there, so the sanitizer build
// catches an over-read) and the single last row stands for both.
TEST(Packed422Reader, OddLastBandReadsOnlyItsRows) {
    auto src = std::make_unique<uint8_t[]>(36);
    for (uint32_t i = 0; i < 36; ++i) src[i] = static_cast<uint8_t>(50 + i);
    PackedContext f(src.get(), 6, 3, false);
    ASSERT_EQ(f.read(), 1u);
    EXPECT_EQ(f.ctx->read_ptr, src.get() + 36);
    for (uint32_t r = 2; r < 16; ++r) EXPECT_EQ(f.cells(0, r), repeat({74, 76, 78, 80, 82, 84}, 8)) << r;
    for (uint32_t r = 1; r < 8; ++r) {
        EXPECT_EQ(f.cells(1, r), repeat({75, 79, 83}, 8)) << r;
        EXPECT_EQ(f.cells(2, r), repeat({77, 81, 85}, 8)) << r;
    }
}

// A frame one pixel wide holds no group: nothing is read, the band is grey.
// Contexts that cannot take the rows are refused untouched.
TEST(Packed422Reader, WidthOneAndUnfitContexts) {
    const uint8_t src[64] = {};
    PackedContext one(src, 1, 8, true);
    ASSERT_EQ(one.read(), 1u);
    EXPECT_EQ(one.ctx->read_ptr, src);
    for (int c = 0; c < 3; ++c) EXPECT_EQ(one.cells(c, 7), Bytes(8, 128));

    EXPECT_EQ(__eko_jpeg_enc_get_raw_duoview422_data(nullptr), 0u);
    PackedContext f420(src, 8, 16, false);  // 4:2:2 rows would need 16 chroma rows of 8
    EXPECT_EQ(__eko_jpeg_enc_get_raw_duoview422_data_for_yuv422(f420.ctx), 0u);
    EXPECT_EQ(f420.ctx->read_ptr, src);
    EXPECT_EQ(f420.cells(1, 0), Bytes(8, 0xEE));
}

// Whole frames through initialisation, header, reader and coding pass per
// band, end mark. Odd heights put a single row in the last 4:2:0 pair; odd
// widths leave the last column to the edge repetition.
TEST(Packed422Encode, DecodesCloseToTheSource) {
    tekoj_test::FaultScope scope;
    for (auto [w, h, keep422] : {std::tuple{96, 64, false}, {70, 45, false}, {2, 1, false}, {71, 33, true},
                                 {64, 24, true}, {3, 5, true}}) {
        const int groups = w / 2;  // smooth colour ramps
        Bytes packed(size_t(h) * groups * 4);
        for (int y = 0; y < h; ++y)
            for (int k = 0; k < groups; ++k) {
                uint8_t* g = &packed[(size_t(y) * groups + k) * 4];
                g[0] = uint8_t(40 + 2 * k + y), g[1] = uint8_t(100 + k), g[2] = uint8_t(41 + 2 * k + y);
                g[3] = uint8_t(150 - y);
            }
        Bytes jpeg;
        {
            PackedContext p(packed.data(), w, h, keep422);
            ASSERT_NE(p.ctx, nullptr);
            __eko_jpeg_enc_make_header(p.ctx);
            for (uint32_t band = 0; band < p.ctx->total_imcu_rows; ++band) {
                EXPECT_EQ(p.read(), 1u);
                __eko_jpeg_enc_compress_data(p.ctx, p.ctx->sample_rows->row_arrays);
                p.ctx->sample_rows->band_counter++;
            }
            EXPECT_EQ(p.ctx->read_ptr, packed.data() + packed.size()) << "the whole frame, not a byte more";
            __eko_jpeg_enc_make_end_mark(p.ctx);
            jpeg.assign(p.ctx->output->buffer, p.ctx->output->buffer + p.ctx->output->total);
        }
        const tekoj_test::Decoded d = tekoj_test::decode_jpeg(jpeg, true);
        ASSERT_TRUE(d.ok && !d.warning) << w << "x" << h << ": " << d.message;
        ASSERT_EQ(d.width * d.height, w * h);
        Bytes luma;  // the source's Y, last column repeated for odd widths
        for (int y = 0; y < h; ++y)
            for (int x = 0; x < w; ++x) {
                const int col = std::min(x, 2 * groups - 1);
                luma.push_back(packed[(size_t(y) * groups + col / 2) * 4 + (col & 1) * 2]);
            }
        EXPECT_GT(tekoj_test::psnr(luma.data(), d.pixels.data(), luma.size()), 40.0) << w << "x" << h;
    }
    EXPECT_EQ(tekoj_test::live_blocks(), 0);
}

}  // namespace
