// YUV 4:2:0 to RGB565: exported tables, single pixels, refused arguments and
// golden frames (odd sizes, both source layouts).
#include <TekoJEncoderInternal.h>

#include "support/test_support.h"

#include <gtest/gtest.h>

#include <array>

namespace {

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

}  // namespace
