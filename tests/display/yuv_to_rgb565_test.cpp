// YUV 4:2:0 to RGB565: exported tables, single pixels, which chroma sample
// serves which pixel, golden frames and refused arguments.
#include <TekoJEncoder.h>

#include "support/test_support.h"

#include <gtest/gtest.h>

#include <vector>

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

// The table sample values are checked where the tables are built; these
// pixels go through the exported tables and the whole conversion.
TEST(DisplayConvert, TablesAndSinglePixels) {
    for (int k = 0; k < 1024; ++k) ASSERT_EQ(eko_EnRangeTalbe[k], k <= 512 ? 0 : (k >= 767 ? 255 : k - 512));
    for (Converter f : {eko_DuoYUV420toRGB565, eko_DuoPYV0420toRGB565}) {
        EXPECT_EQ(convert(f, {128, 128, 128}, 1, 1), Words{0x83F0});  // 129, 127, 130
        EXPECT_EQ(convert(f, {255, 255, 255}, 1, 1), Words{0xFBDF});  // 255, 120, 255
        EXPECT_EQ(convert(f, {0, 0, 0}, 1, 1), Words{0x0420});        // 0, 134, 0
    }
}

// Each pixel equals the one-pixel conversion of its luma with the chroma
// sample of its 2x2 block (odd last column / row served alone); both source
// layouts agree.
TEST(DisplayConvert, ChromaSampleServesItsBlock) {
    for (auto [w, h] : {std::pair{3, 3}, {4, 2}, {5, 4}, {2, 5}, {1, 3}, {17, 9}}) {
        const int cw = (w + 1) / 2, ch = (h + 1) / 2;
        Bytes luma(size_t(w) * h), cb(size_t(cw) * ch), cr(cb.size());
        for (size_t i = 0; i < luma.size(); ++i) luma[i] = static_cast<uint8_t>(40 + 13 * i);
        for (size_t i = 0; i < cb.size(); ++i) {
            cb[i] = static_cast<uint8_t>(10 + 71 * i);
            cr[i] = static_cast<uint8_t>(240 - 37 * i);
        }
        Bytes planar = luma, vu = luma;
        planar.insert(planar.end(), cb.begin(), cb.end());
        planar.insert(planar.end(), cr.begin(), cr.end());
        for (size_t i = 0; i < cb.size(); ++i) vu.insert(vu.end(), {cr[i], cb[i]});  // V first

        const Words a = convert(eko_DuoYUV420toRGB565, planar, w, h);
        EXPECT_EQ(convert(eko_DuoPYV0420toRGB565, vu, w, h), a) << w << "x" << h;
        for (int y = 0; y < h; ++y)
            for (int x = 0; x < w; ++x) {
                const size_t c = size_t(y / 2) * cw + x / 2;
                const Words one = convert(eko_DuoYUV420toRGB565, {luma[size_t(y) * w + x], cb[c], cr[c]}, 1, 1);
                ASSERT_EQ(a[size_t(y) * w + x], one[0]) << w << "x" << h << " at " << x << "," << y;
            }
    }
}

TEST(DisplayConvert, GoldenFrames) {
    using Case = std::pair<std::string, Converter>;
    for (const auto& [name, f] :
         {Case{"rgb565-from-yuv420-17x9", eko_DuoYUV420toRGB565}, Case{"rgb565-from-pyv420-17x9", eko_DuoPYV0420toRGB565}}) {
        const Bytes in = tekoj_test::read_file(tekoj_test::golden_path(name + ".in"));
        const Bytes expected = tekoj_test::read_file(tekoj_test::golden_path(name + ".expected"));
        ASSERT_EQ(in.size(), size_t(17 * 9 + 2 * 9 * 5)) << name;
        Bytes le;
        for (uint16_t p : convert(f, in, 17, 9)) le.insert(le.end(), {uint8_t(p & 0xFF), uint8_t(p >> 8)});
        EXPECT_EQ(le, expected) << name;
    }
}

TEST(DisplayConvert, RefusesNullAndEmpty) {
    const Bytes src(4 * 4 * 3 / 2, 90);
    for (Converter f : {eko_DuoYUV420toRGB565, eko_DuoPYV0420toRGB565}) {
        Words dst(16, 0x1234);
        EXPECT_EQ(f(nullptr, 4, 4, dst.data()) | f(src.data(), 4, 4, nullptr), 0u);
        EXPECT_EQ(f(src.data(), 0, 4, dst.data()) | f(src.data(), 4, 0, dst.data()), 0u);
        EXPECT_EQ(f(src.data(), -4, 4, dst.data()) | f(src.data(), 4, -1, dst.data()), 0u);
        EXPECT_EQ(dst, Words(16, 0x1234));
    }
}

}  // namespace
