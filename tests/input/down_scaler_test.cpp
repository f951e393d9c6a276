// The 4:2:2 down-scaler: exact samples against a closed-form model of the
// quarter / three-quarter taps, the golden case, refusals, and its output
// going straight into the encoder as format 2.
#include <TekoJEncoder.h>

#include "support/fault_os_layer.h"
#include "support/test_support.h"

#include <gtest/gtest.h>

#include <algorithm>
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
    // Scale 1, halving, 640x480 to 320x240, a 5x3 output (U at 15, V at 21),
    // one source row serving both taps, odd sizes and padded strides.
    struct Case {
        int sw, sh, stride, dw, dh;
    } cases[] = {{6, 4, 6, 6, 4},     {8, 6, 10, 8, 6}, {4, 2, 4, 2, 1},     {640, 480, 640, 320, 240},
                 {17, 9, 18, 5, 3},   {9, 1, 10, 9, 1}, {33, 31, 34, 32, 30}, {100, 75, 100, 1, 1},
                 {1, 9, 2, 1, 4},     {3840, 16, 3840, 1920, 8}};
    for (const Case& c : cases) {
        const Bytes src = packed_frame(c.stride, c.sh, c.sw * 31 + c.dh);
        EXPECT_EQ(scale(src, c.sw, c.sh, c.stride, c.dw, c.dh), model(src, c.sw, c.sh, c.stride, c.dw, c.dh))
            << c.sw << "x" << c.sh << " -> " << c.dw << "x" << c.dh;
    }
}

TEST(DownScale, GoldenCase) {
    const Bytes in = tekoj_test::read_file(tekoj_test::golden_path("downscale-37x20s40-to-13x7.in"));
    const Bytes expected = tekoj_test::read_file(tekoj_test::golden_path("downscale-37x20s40-to-13x7.expected"));
    ASSERT_EQ(in.size(), size_t(20 * 80));
    EXPECT_EQ(scale(in, 37, 20, 40, 13, 7), expected);
}

TEST(DownScale, RefusesBadArgumentsAndWritesNothing) {
    tekoj_test::FaultScope scope;
    const Bytes src = packed_frame(8, 8, 5);
    Bytes dst(256, 0x5A);
    auto refused = [&](const uint8_t* s, int sw, int sh, int stride, uint8_t* d, int dw, int dh, uint32_t code) {
        eko_SetError(EKO_OK);
        __eko_jpeg_enc_down_scale_yuv422(s, sw, sh, stride, d, dw, dh);
        return eko_GetLastError() == code && dst == Bytes(256, 0x5A) && tekoj_test::live_blocks() == 0;
    };
    const uint8_t* s = src.data();
    uint8_t* d = dst.data();
    const uint32_t arg = EKO_ERR_ARGUMENT;
    EXPECT_TRUE(refused(s, 8, 8, 8, d, 9, 4, arg) && refused(s, 8, 8, 8, d, 4, 9, arg));  // enlargement
    EXPECT_TRUE(refused(s, 8, 8, 7, d, 4, 4, arg) && refused(s, 7, 8, 7, d, 4, 4, arg));  // short stride
    EXPECT_TRUE(refused(s, 0, 8, 8, d, 4, 4, arg) && refused(s, 8, -1, 8, d, 4, 4, arg));
    EXPECT_TRUE(refused(s, 8, 8, 8, d, 0, 4, arg) && refused(s, 8, 8, 8, d, 4, -3, arg));
    EXPECT_TRUE(refused(nullptr, 8, 8, 8, d, 4, 4, arg) && refused(s, 8, 8, 8, nullptr, 4, 4, arg));
    tekoj_test::fail_allocation(0);
    EXPECT_TRUE(refused(s, 8, 8, 8, d, 4, 4, EKO_ERR_ALLOC));
}

// The planar output goes straight into the encoder as format 2.
TEST(DownScale, OutputEncodesAsPlanarYuv420) {
    const int sw = 160, sh = 120, dw = 75, dh = 45;
    Bytes packed(size_t(sw) * 2 * sh);  // a smooth gradient with neutral chroma
    for (size_t i = 0; i < packed.size(); ++i) packed[i] = i % 2 ? 128 : uint8_t((i / 2) % sw + (i / 4 / sw) / 2);
    const Bytes small = scale(packed, sw, sh, sw, dw, dh);
    const Bytes jpeg = tekoj_test::encode_to_memory(tekoj_test::image_info(small.data(), dw, dh, 2), 95);
    const tekoj_test::Decoded d = tekoj_test::decode_jpeg(jpeg, true);
    ASSERT_TRUE(d.ok && !d.warning) << d.message;
    ASSERT_EQ(d.width * d.height, dw * dh);
    EXPECT_GT(tekoj_test::psnr(small.data(), d.pixels.data(), size_t(dw) * dh), 40.0);
}

}  // namespace
