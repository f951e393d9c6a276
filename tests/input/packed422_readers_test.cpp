// The packed 4:2:2 readers: band rows of the defined examples and edges on
// real contexts, and whole frames encoded through the exported coding steps
// and decoded by libjpeg-turbo.
#include <TekoJEncoderInternal.h>

#include "support/test_support.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>

namespace {

using namespace tekoj_test;

// Three components, two quantisation tables, restart markers; sampling Y
// 2x1, Cb and Cr 1x1: the frame coded 4:2:2.
const EncoderSettings k422 = [] {
    EncoderSettings s{3, {}, 2, {}, {}, 1, 0, {{0, 2, 1}, {1, 1, 1}, {1, 1, 1}}};
    std::memset(s.quant_tables, 3, sizeof s.quant_tables);
    return s;
}();

// A context coding a w x h packed frame 4:2:0, or 4:2:2 when keep422, with
// its reader; band rows start as 0xEE so unwritten cells show.
struct PackedContext : Context {
    uint32_t (*const read)(EncoderContext*);
    PackedContext(const uint8_t* data, int w, int h, bool keep422)
        : Context(image_info(data, w, h, EKO_FORMAT_YUV420), keep422 ? &k422 : nullptr, 90),
          read(keep422 ? __eko_jpeg_enc_get_raw_duoview422_data_for_yuv422 : __eko_jpeg_enc_get_raw_duoview422_data) {
        if (ctx != nullptr) mark_band_rows();
    }
};

// Reads the first band of the frame in `src` (a heap block that ends where
// the frame does, so the sanitizer build catches an over-read) and expects
// `used` bytes (default: all) consumed. Band rows of Y, Cb and Cr are the
// given rows in order, the last repeated down to the band's end, each its
// last value repeated to the padded width.
void expect_band(const Bytes& src, int w, int h, bool keep422, const std::vector<Bytes>& y,
                 const std::vector<Bytes>& cb, const std::vector<Bytes>& cr, size_t used = SIZE_MAX) {
    PackedContext f(src.data(), w, h, keep422);
    ASSERT_EQ(f.read(f.ctx), 1u);
    EXPECT_EQ(f.ctx->read_ptr, src.data() + std::min(used, src.size()));
    const std::vector<Bytes>* rows[3] = {&y, &cb, &cr};
    for (int c = 0; c < 3; ++c)
        for (uint32_t r = 0; r < f.ctx->comp_info[c].band_rows; ++r) {
            Bytes want = (*rows[c])[std::min<size_t>(r, rows[c]->size() - 1)];
            want.resize(f.ctx->comp_info[c].padded_width, want.back());
            EXPECT_EQ(f.cells(c, r), want) << w << "x" << h << " component " << c << " row " << r;
        }
}

TEST(Packed422Reader, DefinedExamplesEdgesAndUnfitContexts) {
    // 4:2:2, width 4, one row.
    expect_band({10, 128, 20, 130, 30, 129, 40, 131}, 4, 1, true, {{10, 20, 30, 40}}, {{128, 129}}, {{130, 131}});
    // 4:2:0, width 2, two rows: chroma of the upper row, 6 and 8 dropped.
    expect_band({1, 2, 3, 4, 5, 6, 7, 8}, 2, 2, false, {{1, 3}, {5, 7}}, {{2}}, {{4}});
    // Width 5 in 8-byte rows: Y column 4 and chroma column 2 have no sample.
    expect_band({11, 21, 12, 31, 13, 22, 14, 32, 15, 23, 16, 33, 17, 24, 18, 34}, 5, 2, true,
                {{11, 12, 13, 14}, {15, 16, 17, 18}}, {{21, 22}, {23, 24}}, {{31, 32}, {33, 34}});
    // Height 3 in 4:2:0: the band's second pair has only its upper row, which
    // stands for both.
    Bytes ramp(36);
    for (size_t i = 0; i < ramp.size(); ++i) ramp[i] = uint8_t(50 + i);
    expect_band(ramp, 6, 3, false, {{50, 52, 54, 56, 58, 60}, {62, 64, 66, 68, 70, 72}, {74, 76, 78, 80, 82, 84}},
                {{51, 55, 59}, {75, 79, 83}}, {{53, 57, 61}, {77, 81, 85}});
    // Width 1 holds no group: nothing is read, the band is grey.
    expect_band(Bytes(32, 9), 1, 8, true, {{128}}, {{128}}, {{128}}, 0);
    // Contexts that cannot take the rows are refused untouched: 4:2:2 rows
    // would need 16 chroma rows of 8.
    PackedContext f420(ramp.data(), 8, 16, false);
    EXPECT_TRUE(__eko_jpeg_enc_get_raw_duoview422_data(nullptr) == 0 && eko_GetLastError() == EKO_ERR_ARGUMENT);
    EXPECT_TRUE(__eko_jpeg_enc_get_raw_duoview422_data_for_yuv422(f420.ctx) == 0 &&
                eko_GetLastError() == EKO_ERR_SAMPLING);
    EXPECT_TRUE(f420.ctx->read_ptr == ramp.data() && f420.cells(1, 0) == Bytes(8, 0xEE));
}

// Whole frames through initialisation, header, reader and coding pass per
// band, end mark. Odd heights put a single row in the last 4:2:0 pair; odd
// widths leave the last column to the edge repetition.
TEST(Packed422Encode, DecodesCloseToTheSource) {
    NoLeak no_leak;
    const int cases[][3] = {{96, 64, 0}, {70, 45, 0}, {2, 1, 0}, {71, 33, 1}, {64, 24, 1}, {3, 5, 1}};
    for (const auto& [w, h, keep422] : cases) {
        Bytes packed, luma;  // smooth ramps, and the luma expected back
        for (int y = 0; y < h; ++y) {
            for (int k = 0; k < w / 2; ++k)
                packed.insert(packed.end(), {uint8_t(40 + 2 * k + y), uint8_t(100 + k), uint8_t(41 + 2 * k + y),
                                             uint8_t(150 - y)});
            for (int x = 0; x < w; ++x) luma.push_back(uint8_t(40 + std::min(x, w / 2 * 2 - 1) + y));
        }
        PackedContext p(packed.data(), w, h, keep422);
        ASSERT_NE(p.ctx, nullptr);
        __eko_jpeg_enc_make_header(p.ctx);
        for (uint32_t band = 0; band < p.ctx->total_imcu_rows; ++band, ++p.ctx->sample_rows->band_counter) {
            EXPECT_EQ(p.read(p.ctx), 1u);
            __eko_jpeg_enc_compress_data(p.ctx, p.ctx->sample_rows->row_arrays);
        }
        EXPECT_EQ(p.ctx->read_ptr, packed.data() + packed.size()) << "the whole frame, not a byte more";
        __eko_jpeg_enc_make_end_mark(p.ctx);
        const Decoded d = decode_jpeg(Bytes(p.ctx->output->buffer, p.ctx->output->buffer + p.ctx->output->total), true);
        ASSERT_TRUE(d.ok && !d.warning && d.width == w && d.height == h) << w << "x" << h << ": " << d.message;
        EXPECT_GT(psnr(luma.data(), d.pixels.data(), luma.size()), 40.0) << w << "x" << h;
    }
}

}  // namespace
