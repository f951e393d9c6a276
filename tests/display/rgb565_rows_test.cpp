// Every SIMD level's RGB565 row kernels against the portable (table-driven)
// ones, word for word: one and two luma rows, both chroma layouts, every
// width from 1 to 48 and a few large odd ones, all 65536 chroma pairs, and
// luma at the clamping extremes. Buffers have exactly the described size.
#include "display/rgb565_rows.h"

#include "support/test_support.h"

#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace {

using namespace tekoj;
using tekoj_test::Bytes;
using Words = std::vector<uint16_t>;

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
