// The 4:2:2 down-scaler: exact samples against a closed-form model of the
// quarter / three-quarter taps, the golden case, refusals, and its output
// going straight into the encoder as format 2.
#include <TekoJEncoder.h>

#include "support/fault_os_layer.h"
#include "support/test_support.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <vector>

namespace {

using tekoj_test::Bytes;

// Packed 4:2:2 with a recognisable value in every byte.
Bytes packed_frame(int stride, int height, uint32_t seed) {
    Bytes src(static_cast<size_t>(2 * stride) * height);
    uint32_t s = seed;
    for (auto& b : src) b = static_cast<uint8_t>((s = s * 1103515245u + 12345u) >> 23);
    return src;
}

size_t planar_size(int w, int h) { return static_cast<size_t>(w) * h + 2 * size_t((w + 1) / 2) * ((h + 1) / 2); }

// Model: taps found by division, each output sample the floor of the mean of
// its four taps; chroma of even rows from the even column.
Bytes model(const Bytes& src, int sw, int sh, int stride, int dw, int dh) {
    auto tap = [](int64_t offset, int i, int s, int d) { return static_cast<int>((offset + int64_t(i) * s) / d); };
    Bytes out(planar_size(dw, dh));
    const size_t u0 = size_t(dw) * dh, v0 = u0 + size_t((dw + 1) / 2) * ((dh + 1) / 2);
    for (int k = 0; k < dh; ++k) {
        const int rows[2] = {tap(sh >> 2, k, sh, dh), tap((3 * sh) >> 2, k, sh, dh)};
        for (int i = 0; i < dw; ++i) {
            const int cols[2] = {tap(sw >> 2, i, sw, dw), tap((3 * sw) >> 2, i, sw, dw)};
            int sum[3] = {0, 0, 0};
            for (int r : rows)
                for (int x : cols) {
                    const uint8_t* p = &src[size_t(r) * 2 * stride];
                    sum[0] += p[2 * x];
                    sum[1] += p[(2 * x & ~3) + 1];
                    sum[2] += p[2 * x | 3];
                }
            out[size_t(k) * dw + i] = static_cast<uint8_t>(sum[0] / 4);
            if (k % 2 == 0 && i % 2 == 0) {
                const size_t c = size_t(k / 2) * ((dw + 1) / 2) + i / 2;
                out[u0 + c] = static_cast<uint8_t>(sum[1] / 4);
                out[v0 + c] = static_cast<uint8_t>(sum[2] / 4);
            }
        }
    }
    return out;
}

// Scales into a buffer with a guard tail and checks that nothing beyond the
// planar image was touched.
Bytes scale(const Bytes& src, int sw, int sh, int stride, int dw, int dh) {
    Bytes dst(planar_size(dw, dh) + 16, 0xA5);
    __eko_jpeg_enc_down_scale_yuv422(src.data(), sw, sh, stride, dst.data(), dw, dh);
    EXPECT_TRUE(std::all_of(dst.end() - 16, dst.end(), [](uint8_t b) { return b == 0xA5; }));
    dst.resize(dst.size() - 16);
    return dst;
}

TEST(DownScale, MatchesTheTapModel) {
    struct Case {
        int sw, sh, stride, dw, dh;
    } cases[] = {{6, 4, 6, 6, 4},     {8, 6, 10, 8, 6},   {4, 2, 4, 2, 1},     {640, 480, 640, 320, 240},
                 {37, 20, 40, 13, 7}, {17, 9, 18, 5, 3},  {33, 31, 34, 32, 30}, {100, 75, 100, 1, 1},
                 {9, 1, 10, 9, 1},    {1, 9, 2, 1, 4},    {3840, 16, 3840, 1920, 8}};
    for (const Case& c : cases) {
        const Bytes src = packed_frame(c.stride, c.sh, c.sw * 31 + c.dh);
        EXPECT_EQ(scale(src, c.sw, c.sh, c.stride, c.dw, c.dh), model(src, c.sw, c.sh, c.stride, c.dw, c.dh))
            << c.sw << "x" << c.sh << " -> " << c.dw << "x" << c.dh;
    }
}

TEST(DownScale, ScaleOneAndHalving) {
    // Scale 1 copies Y, and chroma of even rows and columns from the group.
    const Bytes src = {10, 100, 20, 200, 30, 110, 40, 210, 50, 120, 60, 220, 70, 130, 80, 230};
    EXPECT_EQ(scale(src, 4, 2, 4, 4, 2), (Bytes{10, 20, 30, 40, 50, 60, 70, 80, 100, 110, 200, 210}));
    // 4x2 to 2x1: columns (0,1) and (2,3) over both rows; chroma from column 0.
    EXPECT_EQ(scale(src, 4, 2, 4, 2, 1), (Bytes{(10 + 20 + 50 + 60) / 4, (30 + 40 + 70 + 80) / 4,
                                                (100 + 100 + 120 + 120) / 4, (200 + 200 + 220 + 220) / 4}));
}

TEST(DownScale, GoldenCase) {
    const Bytes in = tekoj_test::read_file(tekoj_test::golden_path("downscale-37x20s40-to-13x7.in"));
    const Bytes expected = tekoj_test::read_file(tekoj_test::golden_path("downscale-37x20s40-to-13x7.expected"));
    ASSERT_EQ(in.size(), size_t(20 * 80));
    EXPECT_EQ(scale(in, 37, 20, 40, 13, 7), expected);
}

TEST(DownScale, RowWriterPacksEvenAndOddRows) {
    auto word = [](uint32_t y, uint32_t u, uint32_t v) { return y << 20 | u << 10 | v; };
    const uint32_t words[3] = {word(1020, 4, 8), word(403, 999, 999), word(0, 1019, 1)};
    uint8_t y[6] = {}, u[2] = {}, v[2] = {};
    Yuv420Cursor cur{y, u, v};
    __eko_jpeg_enc_write_yuv_to_yuv420(words, 3, &cur, 0);
    __eko_jpeg_enc_write_yuv_to_yuv420(words, 3, &cur, 1);
    EXPECT_EQ(Bytes(y, y + 6), (Bytes{255, 100, 0, 255, 100, 0}));
    EXPECT_EQ(Bytes(u, u + 2), (Bytes{1, 254}));
    EXPECT_EQ(Bytes(v, v + 2), (Bytes{2, 0}));
    EXPECT_EQ(cur.y, y + 6);
    EXPECT_EQ(cur.u, u + 2);
    EXPECT_EQ(cur.v, v + 2);
}

TEST(DownScale, RefusesBadArgumentsAndWritesNothing) {
    tekoj_test::FaultScope scope;
    const Bytes src = packed_frame(8, 8, 5);
    struct Bad {
        const uint8_t* s;
        int sw, sh, stride, dw, dh;
        bool null_dst;
    } cases[] = {
        {src.data(), 8, 8, 8, 9, 4, false},  {src.data(), 8, 8, 8, 4, 9, false},  // enlargement
        {src.data(), 8, 8, 7, 4, 4, false},  {src.data(), 7, 8, 7, 4, 4, false},  // stride short of whole groups
        {src.data(), 0, 8, 8, 4, 4, false},  {src.data(), 8, -1, 8, 4, 4, false},
        {src.data(), 8, 8, 8, 0, 4, false},  {src.data(), 8, 8, 8, 4, -3, false},
        {nullptr, 8, 8, 8, 4, 4, false},     {src.data(), 8, 8, 8, 4, 4, true},
    };
    for (const Bad& b : cases) {
        Bytes dst(256, 0x5A);
        eko_SetError(EKO_OK);
        __eko_jpeg_enc_down_scale_yuv422(b.s, b.sw, b.sh, b.stride, b.null_dst ? nullptr : dst.data(), b.dw, b.dh);
        EXPECT_EQ(eko_GetLastError(), uint32_t(EKO_ERR_ARGUMENT)) << b.sw << " " << b.sh << " " << b.stride;
        EXPECT_EQ(dst, Bytes(256, 0x5A));
    }
    EXPECT_EQ(tekoj_test::live_blocks(), 0);

    Bytes dst(256, 0x5A);
    tekoj_test::fail_allocation(0);
    __eko_jpeg_enc_down_scale_yuv422(src.data(), 8, 8, 8, dst.data(), 4, 4);
    EXPECT_EQ(eko_GetLastError(), uint32_t(EKO_ERR_ALLOC));
    EXPECT_EQ(dst, Bytes(256, 0x5A));
    EXPECT_EQ(tekoj_test::live_blocks(), 0);

    tekoj_test::fail_allocation(-1);
    __eko_jpeg_enc_down_scale_yuv422(src.data(), 8, 8, 8, dst.data(), 4, 4);
    EXPECT_EQ(tekoj_test::live_blocks(), 0);
}

// A packed frame made from a photo, shrunk and encoded as format 2: the
// decoded picture must match the shrunk frame's own colours.
TEST(DownScale, OutputEncodesAsPlanarYuv420) {
    const int sw = 160, sh = 120, dw = 75, dh = 45;
    const Bytes rgb = tekoj_test::photo_rgb(sw, sh, 7);
    const Bytes yuv = tekoj_test::rgb_to_yuv420(rgb, sw, sh);
    // Repack the 4:2:0 frame as 4:2:2 (each chroma row serves two rows).
    Bytes packed(size_t(sw) * 2 * sh);
    const uint8_t* u = yuv.data() + sw * sh;
    const uint8_t* v = u + (sw / 2) * (sh / 2);
    for (int y = 0; y < sh; ++y)
        for (int k = 0; k < sw / 2; ++k) {
            uint8_t* g = &packed[size_t(y) * 2 * sw + 4 * k];
            g[0] = yuv[size_t(y) * sw + 2 * k];
            g[1] = u[(y / 2) * (sw / 2) + k];
            g[2] = yuv[size_t(y) * sw + 2 * k + 1];
            g[3] = v[(y / 2) * (sw / 2) + k];
        }
    const Bytes small = scale(packed, sw, sh, sw, dw, dh);
    const Bytes jpeg = tekoj_test::encode_to_memory(tekoj_test::image_info(small.data(), dw, dh, 2), 95);
    ASSERT_FALSE(jpeg.empty());
    const tekoj_test::Decoded d = tekoj_test::decode_jpeg(jpeg);
    ASSERT_TRUE(d.ok && !d.warning) << d.message;
    ASSERT_EQ(d.width, dw);
    ASSERT_EQ(d.height, dh);

    // Expected colours: the shrunk planes converted with the JFIF equations.
    Bytes expect(size_t(dw) * dh * 3);
    const uint8_t* su = small.data() + dw * dh;
    const uint8_t* sv = su + ((dw + 1) / 2) * ((dh + 1) / 2);
    for (int y = 0; y < dh; ++y)
        for (int x = 0; x < dw; ++x) {
            const double Y = small[size_t(y) * dw + x];
            const size_t c = size_t(y / 2) * ((dw + 1) / 2) + x / 2;
            const double cb = su[c] - 128.0, cr = sv[c] - 128.0;
            const double px[3] = {Y + 1.402 * cr, Y - 0.344136 * cb - 0.714136 * cr, Y + 1.772 * cb};
            for (int i = 0; i < 3; ++i)
                expect[(size_t(y) * dw + x) * 3 + i] = static_cast<uint8_t>(std::clamp(std::lround(px[i]), 0L, 255L));
        }
    EXPECT_GT(tekoj_test::psnr(expect.data(), d.pixels.data(), expect.size()), 34.0);
}

}  // namespace
