// YUV 4:2:0 to RGB565: the exported tables, single-pixel arithmetic, which
// chroma sample serves which pixel, golden frames and refused arguments.
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
    for (size_t i = size_t(w) * h; i < out.size(); ++i) EXPECT_EQ(out[i], 0xBEEF) << "written beyond the image";
    out.resize(size_t(w) * h);
    return out;
}

// A uniform frame of one Y, U, V in the three-plane layout.
Bytes uniform(int w, int h, uint8_t y, uint8_t u, uint8_t v) {
    const size_t c = size_t((w + 1) / 2) * ((h + 1) / 2);
    Bytes f(size_t(w) * h, y);
    f.insert(f.end(), c, u);
    f.insert(f.end(), c, v);
    return f;
}

TEST(DisplayTables, CentredOn127) {
    EXPECT_EQ(eko_EnCrrTab[0], -178);
    EXPECT_EQ(eko_EnCrrTab[127], 0);
    EXPECT_EQ(eko_EnCrrTab[128], 1);
    EXPECT_EQ(eko_EnCrrTab[255], 179);
    EXPECT_EQ(eko_EnCbbTab[0], -225);
    EXPECT_EQ(eko_EnCbbTab[127], 0);
    EXPECT_EQ(eko_EnCbbTab[128], 2);
    EXPECT_EQ(eko_EnCbbTab[255], 227);
    EXPECT_EQ(eko_EnCrgTab[0], 5943854);
    EXPECT_EQ(eko_EnCrgTab[127], 0);
    EXPECT_EQ(eko_EnCrgTab[128], -46802);
    EXPECT_EQ(eko_EnCrgTab[255], -5990656);
    EXPECT_EQ(eko_EnCbgTab[0], 2897126);
    EXPECT_EQ(eko_EnCbgTab[127], 32768);
    EXPECT_EQ(eko_EnCbgTab[128], 10214);
    EXPECT_EQ(eko_EnCbgTab[255], -2854144);
    for (int k = 0; k < 1024; ++k)
        ASSERT_EQ(eko_EnRangeTalbe[k], k <= 512 ? 0 : (k >= 767 ? 255 : k - 512)) << k;
    // Rounding of the red and blue terms is floor((c*x + 2^15) / 2^16), also
    // for negative x.
    EXPECT_EQ(eko_EnCrrTab[100], (91881 * -27 + 32768) >> 16);
    EXPECT_EQ(eko_EnCbbTab[1], -223);
}

TEST(DisplayConvert, SinglePixels) {
    for (Converter f : {eko_DuoYUV420toRGB565, eko_DuoPYV0420toRGB565}) {
        EXPECT_EQ(convert(f, uniform(1, 1, 128, 128, 128), 1, 1), Words{0x83F0});
        EXPECT_EQ(convert(f, uniform(1, 1, 255, 255, 255), 1, 1), Words{0xFBDF});  // 255, 120, 255
        EXPECT_EQ(convert(f, uniform(1, 1, 0, 0, 0), 1, 1), Words{0x0420});        // 0, 134, 0
    }
    // Cr alone reaches red and green, Cb alone green and blue.
    const Words red = convert(eko_DuoYUV420toRGB565, uniform(1, 1, 100, 127, 200), 1, 1);
    const int r = 100 + ((91881 * 73 + 32768) >> 16), g = 100 + ((-46802 * 73 + 32768) >> 16);
    EXPECT_EQ(red[0], ((r >> 3) << 11) | ((g >> 2) << 5) | (100 >> 3));
}

// Each pixel must equal the one-pixel conversion of its own luma with the
// chroma sample of its 2x2 block (the last column / row of odd sizes served
// alone), and both layouts must agree.
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
    using Case = std::pair<const char*, Converter>;
    for (auto [name, f] : {Case{"rgb565-from-yuv420-17x9", eko_DuoYUV420toRGB565},
                           Case{"rgb565-from-pyv420-17x9", eko_DuoPYV0420toRGB565}}) {
        const std::string base = name;
        const Bytes in = tekoj_test::read_file(tekoj_test::golden_path(base + ".in"));
        const Bytes expected = tekoj_test::read_file(tekoj_test::golden_path(base + ".expected"));
        ASSERT_EQ(in.size(), size_t(17 * 9 + 2 * 9 * 5)) << name;
        ASSERT_EQ(expected.size(), size_t(17 * 9 * 2)) << name;
        const Words out = convert(f, in, 17, 9);
        Bytes le;
        for (uint16_t p : out) le.insert(le.end(), {uint8_t(p & 0xFF), uint8_t(p >> 8)});
        EXPECT_EQ(le, expected) << name;
    }
}

// Against libjpeg-turbo's own YUV to RGB path: apart from the 127 centring
// (a tint of at most 2) and RGB565 truncation, the colours agree.
TEST(DisplayConvert, CloseToLibjpegTurboColours) {
    const int w = 33, h = 21;
    const Bytes rgb = tekoj_test::photo_rgb(w, h, 3);
    const Bytes yuv = tekoj_test::rgb_to_yuv420(rgb, w, h);
    const Words out = convert(eko_DuoYUV420toRGB565, yuv, w, h);
    const Bytes jpeg = tekoj_test::encode_to_memory(tekoj_test::image_info(yuv.data(), w, h, 2), 100);
    if (jpeg.empty()) GTEST_SKIP() << "encoder not available";
    const tekoj_test::Decoded d = tekoj_test::decode_jpeg(jpeg);
    ASSERT_TRUE(d.ok);
    Bytes ours(out.size() * 3);
    for (size_t i = 0; i < out.size(); ++i) {
        ours[3 * i] = static_cast<uint8_t>((out[i] >> 11) << 3);
        ours[3 * i + 1] = static_cast<uint8_t>(((out[i] >> 5) & 63) << 2);
        ours[3 * i + 2] = static_cast<uint8_t>((out[i] & 31) << 3);
    }
    EXPECT_GT(tekoj_test::psnr(ours.data(), d.pixels.data(), ours.size()), 30.0);
}

TEST(DisplayConvert, RefusesNullAndEmpty) {
    const Bytes src = uniform(4, 4, 50, 60, 70);
    for (Converter f : {eko_DuoYUV420toRGB565, eko_DuoPYV0420toRGB565}) {
        Words dst(16, 0x1234);
        EXPECT_EQ(f(nullptr, 4, 4, dst.data()), 0u);
        EXPECT_EQ(f(src.data(), 4, 4, nullptr), 0u);
        EXPECT_EQ(f(src.data(), 0, 4, dst.data()), 0u);
        EXPECT_EQ(f(src.data(), 4, 0, dst.data()), 0u);
        EXPECT_EQ(f(src.data(), -4, 4, dst.data()), 0u);
        EXPECT_EQ(f(src.data(), 4, -1, dst.data()), 0u);
        EXPECT_EQ(dst, Words(16, 0x1234));
    }
}

}  // namespace
