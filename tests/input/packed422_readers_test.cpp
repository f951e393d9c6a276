// Band rows produced by the packed 4:2:2 readers, on a context whose geometry
// is laid out by hand as creation would, so each band can be inspected alone.
#include <TekoJEncoder.h>

#include <gtest/gtest.h>

#include <memory>
#include <vector>

namespace {

using Rows = std::vector<std::vector<uint8_t>>;

// A three-component context for a w x h frame with Y sampled yh x yv and
// chroma 1 x 1, positioned at band `band` of the frame.
struct BandFixture {
    std::unique_ptr<EncoderContext> ctx = std::make_unique<EncoderContext>();
    ComponentInfo comp[3]{};
    SampleRowSet set{};
    Rows storage[3];
    std::vector<uint8_t*> pointers[3];

    BandFixture(uint32_t w, uint32_t h, uint8_t yh, uint8_t yv, uint32_t band = 0) {
        *ctx = EncoderContext{};
        ctx->num_components = 3;
        ctx->comp_info = comp;
        ctx->sample_rows = &set;
        for (int c = 0; c < 3; ++c) {
            const uint32_t hs = c == 0 ? yh : 1, vs = c == 0 ? yv : 1;
            ComponentInfo& ci = comp[c];
            ci.width_in_blocks = (w * hs + yh * 8 - 1) / (yh * 8);
            ci.padded_width = ci.width_in_blocks * 8;
            ci.downsampled_width = (w * hs + yh - 1) / yh;
            ci.downsampled_height = (h * vs + yv - 1) / yv;
            ci.band_rows = vs * 8;
            const uint32_t bands = (h + yv * 8 - 1) / (yv * 8);
            const uint32_t rest = ci.downsampled_height % ci.band_rows;
            ci.rows_this_band = band + 1 == bands && rest != 0 ? rest : ci.band_rows;
            storage[c].assign(ci.band_rows, std::vector<uint8_t>(ci.width_in_blocks * yh * 8 / hs, 0xEE));
            for (auto& row : storage[c]) pointers[c].push_back(row.data());
            set.row_arrays[c] = pointers[c].data();
            ctx->cur_comp_info[c] = &ci;
        }
    }
    const std::vector<uint8_t>& row(int c, uint32_t r) const { return storage[c][r]; }
    // The first `padded_width` cells of a row, the part the transform reads.
    std::vector<uint8_t> cells(int c, uint32_t r) const {
        return {storage[c][r].begin(), storage[c][r].begin() + comp[c].padded_width};
    }
};

std::vector<uint8_t> repeat(std::vector<uint8_t> head, size_t total) {
    while (head.size() < total) head.push_back(head.back());
    return head;
}

TEST(Packed422Reader, KeepsOneChromaRowPerRowFor422) {
    BandFixture f(4, 1, 2, 1);
    const uint8_t src[] = {10, 128, 20, 130, 30, 129, 40, 131};
    f.ctx->read_ptr = src;
    EXPECT_EQ(__eko_jpeg_enc_get_raw_duoview422_data_for_yuv422(f.ctx.get()), 1u);
    EXPECT_EQ(f.cells(0, 0), repeat({10, 20, 30, 40}, 8));
    EXPECT_EQ(f.cells(1, 0), repeat({128, 129}, 8));
    EXPECT_EQ(f.cells(2, 0), repeat({130, 131}, 8));
    for (uint32_t r = 1; r < 8; ++r)
        for (int c = 0; c < 3; ++c) EXPECT_EQ(f.cells(c, r), f.cells(c, 0)) << "component " << c << " row " << r;
    EXPECT_EQ(f.ctx->read_ptr, src + 8);
}

TEST(Packed422Reader, TakesUpperRowChromaFor420) {
    BandFixture f(2, 2, 2, 2);
    const uint8_t src[] = {1, 2, 3, 4, 5, 6, 7, 8};
    f.ctx->read_ptr = src;
    EXPECT_EQ(__eko_jpeg_enc_get_raw_duoview422_data(f.ctx.get()), 1u);
    EXPECT_EQ(f.cells(0, 0), repeat({1, 3}, 8));
    EXPECT_EQ(f.cells(0, 1), repeat({5, 7}, 8));
    EXPECT_EQ(f.cells(1, 0), repeat({2}, 8));  // 6 and 8 of the lower row are dropped
    EXPECT_EQ(f.cells(2, 0), repeat({4}, 8));
    EXPECT_EQ(f.cells(0, 15), f.cells(0, 1));
    EXPECT_EQ(f.cells(1, 7), f.cells(1, 0));
    EXPECT_EQ(f.ctx->read_ptr, src + 8);
}

TEST(Packed422Reader, FullBandsAdvanceByTheirRows) {
    for (uint32_t w : {6u, 7u, 40u}) {
        const uint32_t groups = w >> 1;
        std::vector<uint8_t> src(16 * groups * 4);
        for (size_t i = 0; i < src.size(); ++i) src[i] = static_cast<uint8_t>(i * 7 + 3);

        BandFixture f420(w, 32, 2, 2);
        f420.ctx->read_ptr = src.data();
        __eko_jpeg_enc_get_raw_duoview422_data(f420.ctx.get());
        EXPECT_EQ(f420.ctx->read_ptr, src.data() + 16 * groups * 4) << w;

        BandFixture f422(w, 32, 2, 1);
        f422.ctx->read_ptr = src.data();
        __eko_jpeg_enc_get_raw_duoview422_data_for_yuv422(f422.ctx.get());
        EXPECT_EQ(f422.ctx->read_ptr, src.data() + 8 * groups * 4) << w;

        // Every row of the 4:2:2 band carries its own group bytes; the 4:2:0
        // band's chroma row p is the 4:2:2 band's row 2p.
        for (uint32_t r = 0; r < 8; ++r) {
            const uint8_t* s = src.data() + r * groups * 4;
            for (uint32_t k = 0; k < groups; ++k) {
                ASSERT_EQ(f422.row(0, r)[2 * k], s[4 * k]);
                ASSERT_EQ(f422.row(0, r)[2 * k + 1], s[4 * k + 2]);
                ASSERT_EQ(f422.row(1, r)[k], s[4 * k + 1]);
                ASSERT_EQ(f422.row(2, r)[k], s[4 * k + 3]);
            }
            if (r < 4) {
                EXPECT_EQ(f420.cells(1, r), f422.cells(1, 2 * r));
            }
        }
    }
}

// Width 5: rows of two groups; column 4 of Y and column 2 of the chroma rows
// have no source sample and repeat the last written one, up to padded_width.
TEST(Packed422Reader, OddWidthRepeatsLastWrittenSample) {
    const uint8_t src[] = {11, 21, 12, 31, 13, 22, 14, 32, 15, 23, 16, 33, 17, 24, 18, 34};
    BandFixture f(5, 2, 2, 1);
    f.ctx->read_ptr = src;
    __eko_jpeg_enc_get_raw_duoview422_data_for_yuv422(f.ctx.get());
    EXPECT_EQ(f.ctx->read_ptr, src + 16);
    EXPECT_EQ(f.cells(0, 1), repeat({15, 16, 17, 18}, 8));
    EXPECT_EQ(f.cells(1, 1), repeat({23, 24}, 8));
    EXPECT_EQ(f.cells(2, 1), repeat({33, 34}, 8));

    BandFixture g(5, 2, 2, 2);
    g.ctx->read_ptr = src;
    __eko_jpeg_enc_get_raw_duoview422_data(g.ctx.get());
    EXPECT_EQ(g.cells(0, 0), repeat({11, 12, 13, 14}, 8));
    EXPECT_EQ(g.cells(1, 0), repeat({21, 22}, 8));
    EXPECT_EQ(g.cells(2, 0), repeat({31, 32}, 8));
    EXPECT_EQ(g.cells(0, 15), g.cells(0, 1));
}

// Height 19: the second band holds 3 rows. The reader must read exactly
// those three rows (the heap block ends there, so an over-read is caught by
// the sanitizer build) and let the single last row stand for both rows of
// its pair.
TEST(Packed422Reader, OddLastBandReadsOnlyItsRows) {
    const uint32_t w = 6, groups = 3;
    auto src = std::make_unique<uint8_t[]>(3 * groups * 4);
    for (uint32_t i = 0; i < 3 * groups * 4; ++i) src[i] = static_cast<uint8_t>(50 + i);
    BandFixture f(w, 19, 2, 2, 1);
    ASSERT_EQ(f.comp[0].rows_this_band, 3u);
    ASSERT_EQ(f.comp[1].rows_this_band, 2u);
    f.ctx->read_ptr = src.get();
    EXPECT_EQ(__eko_jpeg_enc_get_raw_duoview422_data(f.ctx.get()), 1u);
    EXPECT_EQ(f.ctx->read_ptr, src.get() + 3 * groups * 4);
    const std::vector<uint8_t> last = repeat({74, 76, 78, 80, 82, 84}, 8);  // source row 2
    for (uint32_t r = 2; r < 16; ++r) EXPECT_EQ(f.cells(0, r), last) << r;
    EXPECT_EQ(f.cells(1, 1), repeat({75, 79, 83}, 8));
    EXPECT_EQ(f.cells(2, 1), repeat({77, 81, 85}, 8));
    for (uint32_t r = 2; r < 8; ++r) EXPECT_EQ(f.cells(1, r), f.cells(1, 1)) << r;
}

TEST(Packed422Reader, WidthOneGivesNeutralBandAndReadsNothing) {
    const uint8_t dummy = 0;
    for (int yv : {1, 2}) {
        BandFixture f(1, 8, 2, static_cast<uint8_t>(yv));
        f.ctx->read_ptr = &dummy;
        const uint32_t ok = yv == 2 ? __eko_jpeg_enc_get_raw_duoview422_data(f.ctx.get())
                                    : __eko_jpeg_enc_get_raw_duoview422_data_for_yuv422(f.ctx.get());
        EXPECT_EQ(ok, 1u);
        EXPECT_EQ(f.ctx->read_ptr, &dummy);
        for (int c = 0; c < 3; ++c)
            for (uint32_t r = 0; r < f.comp[c].band_rows; ++r)
                EXPECT_EQ(f.cells(c, r), std::vector<uint8_t>(8, 128));
    }
}

TEST(Packed422Reader, RefusesContextsItCannotFill) {
    EXPECT_EQ(__eko_jpeg_enc_get_raw_duoview422_data(nullptr), 0u);
    EXPECT_EQ(__eko_jpeg_enc_get_raw_duoview422_data_for_yuv422(nullptr), 0u);

    const uint8_t src[64] = {};
    BandFixture grey(8, 8, 2, 2);
    grey.ctx->num_components = 1;
    grey.ctx->read_ptr = src;
    EXPECT_EQ(__eko_jpeg_enc_get_raw_duoview422_data(grey.ctx.get()), 0u);

    // 4:2:2 rows into a 4:2:0 context would need 16 chroma rows of 8.
    BandFixture f420(8, 16, 2, 2);
    f420.ctx->read_ptr = src;
    EXPECT_EQ(__eko_jpeg_enc_get_raw_duoview422_data_for_yuv422(f420.ctx.get()), 0u);
    EXPECT_EQ(f420.ctx->read_ptr, src);
    EXPECT_EQ(f420.row(1, 0)[0], 0xEE);
}

}  // namespace
