// YUV 4:2:0 to RGB565: exported tables, single pixels, refused arguments and
// golden frames (odd sizes, both source layouts); and every SIMD level's row
// kernels against the portable (table-driven) ones, word for word: one and
// two luma rows, both chroma layouts, every width from 1 to 48 and a few
// large odd ones, all 65536 chroma pairs, and luma at the clamping extremes.
// Buffers have exactly the described size.
#include <TekoJEncoderInternal.h>

#include "display/rgb565_rows.h"
#include "support/test_support.h"

#include <gtest/gtest.h>

#include <array>
#include <string>
#include <vector>

namespace {

using namespace tekoj;
using tekoj_test::Bytes;
using Words = std::vector<uint16_t>;
using Converter = uint32_t (*)(const uint8_t*, int32_t, int32_t, uint16_t*);

// Converts into a buffer with guard words after the image.
Words convert(Converter f, const Bytes& src, int w, int h) {
    Words out(size_t(w) * h + 4, 0xBEEF);
    EXPECT_EQ(f(src.data(), w, h, out.data()), 1u);
    EXPECT_EQ(Words(out.end() - 4, out.end()), Words(4, 0xBEEF)) << "written beyond the image";
    out.resize(size_t(w) * h);
    return out;
}

TEST(DisplayConvert, TablesSinglePixelsAndRefusals) {
    using Samples = std::array<int32_t, 4>;  // at indices 0, 127, 128 and 255
    for (const auto& [table, want] : {std::pair{eko_EnCrrTab, Samples{-178, 0, 1, 179}},
                                      {eko_EnCbbTab, Samples{-225, 0, 2, 227}},
                                      {eko_EnCrgTab, Samples{5943854, 0, -46802, -5990656}},
                                      {eko_EnCbgTab, Samples{2897126, 32768, 10214, -2854144}}})
        EXPECT_EQ((Samples{table[0], table[127], table[128], table[255]}), want);
    for (int k = 0; k < 1024; ++k) ASSERT_EQ(eko_EnRangeTalbe[k], k <= 512 ? 0 : (k >= 767 ? 255 : k - 512));
    for (Converter f : {eko_DuoYUV420toRGB565, eko_DuoPYV0420toRGB565}) {
        EXPECT_EQ(convert(f, {128, 128, 128}, 1, 1), Words{0x83F0});  // 129, 127, 130
        EXPECT_EQ(convert(f, {255, 255, 255}, 1, 1), Words{0xFBDF});  // 255, 120, 255
        EXPECT_EQ(convert(f, {0, 0, 0}, 1, 1), Words{0x0420});        // 0, 134, 0
        // Null buffers and empty or negative sizes are refused untouched, each
        // with its reason.
        const Bytes src(4 * 4 * 3 / 2, 90);
        Words dst(16, 0x1234);
        const struct { const uint8_t* s; int w, h; uint16_t* d; uint32_t error; } refused[] = {
            {nullptr, 4, 4, dst.data(), EKO_ERR_ARGUMENT}, {src.data(), 4, 4, nullptr, EKO_ERR_ARGUMENT},
            {src.data(), 0, 4, dst.data(), EKO_ERR_DIMENSIONS}, {src.data(), 4, 0, dst.data(), EKO_ERR_DIMENSIONS},
            {src.data(), -4, 4, dst.data(), EKO_ERR_DIMENSIONS}, {src.data(), 4, -1, dst.data(), EKO_ERR_DIMENSIONS}};
        for (const auto& r : refused) EXPECT_TRUE(f(r.s, r.w, r.h, r.d) == 0 && eko_GetLastError() == r.error) << r.w;
        EXPECT_EQ(dst, Words(16, 0x1234));
    }
}

TEST(DisplayConvert, GoldenFrames) {
    using Case = std::pair<std::string, Converter>;
    for (const auto& [name, f] : {Case{"rgb565-from-yuv420-17x9", eko_DuoYUV420toRGB565},
                                  Case{"rgb565-from-pyv420-17x9", eko_DuoPYV0420toRGB565}}) {
        const Bytes in = tekoj_test::read_file(tekoj_test::golden_path(name + ".in"));
        ASSERT_EQ(in.size(), size_t(17 * 9 + 2 * 9 * 5)) << name;
        Bytes le;
        for (uint16_t p : convert(f, in, 17, 9)) le.insert(le.end(), {uint8_t(p & 0xFF), uint8_t(p >> 8)});
        EXPECT_EQ(le, tekoj_test::read_file(tekoj_test::golden_path(name + ".expected"))) << name;
    }
}

// Both rows' output words of one call, for the planar (false) or the
// interleaved (true) layout; `chroma` holds Cb then Cr planes' rows, or the
// V, U pairs.
Words run(const DisplayKernels& k, bool interleaved, const Bytes& luma, size_t width, bool two_rows,
          const Bytes& chroma) {
    const size_t cw = (width + 1) / 2;
    const Bytes y0(luma.begin(), luma.begin() + width), y1(luma.begin() + width, luma.begin() + 2 * width);
    Words d0(width, 0xBEEF), d1(two_rows ? width : 0, 0xBEEF);
    if (interleaved) {
        const Bytes vu(chroma.begin(), chroma.begin() + 2 * cw);
        k.interleaved(y0.data(), two_rows ? y1.data() : nullptr, d0.data(), two_rows ? d1.data() : nullptr, width,
                      vu.data());
    } else {
        const Bytes cb(chroma.begin(), chroma.begin() + cw), cr(chroma.begin() + cw, chroma.begin() + 2 * cw);
        k.planar(y0.data(), two_rows ? y1.data() : nullptr, d0.data(), two_rows ? d1.data() : nullptr, width,
                 cb.data(), cr.data());
    }
    d0.insert(d0.end(), d1.begin(), d1.end());
    return d0;
}

void expect_levels_match(const Bytes& luma, size_t width, const Bytes& chroma, const std::string& what) {
    for (SimdLevel level : {SimdLevel::sse2, SimdLevel::avx2, SimdLevel::avx512, SimdLevel::neon}) {
        const DisplayKernels* k = display_kernels_for(level);
        if (k == nullptr) continue;
        for (bool interleaved : {false, true})
            for (bool two_rows : {false, true})
                ASSERT_EQ(run(*k, interleaved, luma, width, two_rows, chroma),
                          run(kPortableDisplayKernels, interleaved, luma, width, two_rows, chroma))
                    << simd_level_name(level) << (interleaved ? " interleaved " : " planar ") << what
                    << (two_rows ? " two rows" : " one row");
    }
}

TEST(Rgb565Rows, EveryLevelMatchesTheTables) {
    std::vector<size_t> widths;
    for (size_t w = 1; w <= 48; ++w) widths.push_back(w);
    for (size_t w : {63, 64, 65, 1001, 1921}) widths.push_back(w);
    for (size_t w : widths)
        for (uint32_t seed = 1; seed <= 4; ++seed)
            expect_levels_match(tekoj_test::noise_with_extremes(2 * w, seed + 100 * w), w, tekoj_test::noise_with_extremes(w + 1, seed * 31 + w),
                                "width " + std::to_string(w));
    // Every (Cb, Cr) pair of the planar layout once, under luma 0, 255 and a ramp.
    Bytes chroma(2 * 65536);
    for (size_t i = 0; i < 65536; ++i) chroma[i] = static_cast<uint8_t>(i), chroma[65536 + i] = static_cast<uint8_t>(i >> 8);
    for (int luma : {0, 255, -1}) {
        Bytes y(2 * 131072);
        for (size_t i = 0; i < y.size(); ++i) y[i] = static_cast<uint8_t>(luma < 0 ? i * 7 : luma);
        expect_levels_match(y, 131072, chroma, "all chroma pairs, luma " + std::to_string(luma));
    }
}

}  // namespace
