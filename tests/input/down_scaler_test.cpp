// The 4:2:2 down-scaler: the golden case, refusals, and its output going
// straight into the encoder as format 2.
#include <TekoJEncoderInternal.h>

#include "support/test_support.h"

#include <gtest/gtest.h>

namespace {

using namespace tekoj_test;

// Scales into a buffer with a guard tail and checks that nothing beyond the
// planar image was touched.
Bytes scale(const Bytes& src, int sw, int sh, int stride, int dw, int dh) {
    Bytes dst(size_t(dw) * dh + 2 * size_t((dw + 1) / 2) * ((dh + 1) / 2) + 16, 0xA5);
    __eko_jpeg_enc_down_scale_yuv422(src.data(), sw, sh, stride, dst.data(), dw, dh);
    EXPECT_EQ(Bytes(dst.end() - 16, dst.end()), Bytes(16, 0xA5)) << "written beyond the image";
    return Bytes(dst.begin(), dst.end() - 16);
}

// The down-scaled image by its closed form: output column i averages source
// columns (sw/4 + i*sw)/dw and (3sw/4 + i*sw)/dw over the two rows chosen the
// same way; chroma comes from even rows and even columns.
Bytes reference(const Bytes& src, int sw, int sh, int stride, int dw, int dh) {
    const auto tap = [](int n, int i, int d, int first) { return ((first ? n >> 2 : (3 * n) >> 2) + i * n) / d; };
    const auto at = [&](int x, int y, int byte) { return src[size_t(y) * 2 * stride + (byte ? (2 * x & ~3) + byte : 2 * x)]; };
    const auto mean = [&](int i, int k, int byte) {
        int sum = 0;
        for (int r : {1, 0})
            for (int c : {1, 0}) sum += at(tap(sw, i, dw, c), tap(sh, k, dh, r), byte);
        return uint8_t(sum / 4);
    };
    Bytes y, u, v;
    for (int k = 0; k < dh; ++k)
        for (int i = 0; i < dw; ++i) {
            y.push_back(mean(i, k, 0));
            if (k % 2 == 0 && i % 2 == 0) u.push_back(mean(i, k, 1)), v.push_back(mean(i, k, 3));
        }
    y.insert(y.end(), u.begin(), u.end());
    y.insert(y.end(), v.begin(), v.end());
    return y;
}

TEST(DownScale, GoldenCaseAndTheClosedFormOfEveryTap) {
    const Bytes in = read_file(golden_path("downscale-37x20s40-to-13x7.in"));
    ASSERT_EQ(in.size(), size_t(20 * 80));
    EXPECT_EQ(scale(in, 37, 20, 40, 13, 7), read_file(golden_path("downscale-37x20s40-to-13x7.expected")));
    // Sizes whose quarter and three-quarter positions fall on every
    // remainder, scale 1, odd destinations, wide strides, and halved widths
    // (which take a separate contiguous path).
    const int cases[][5] = {{37, 20, 40, 13, 7},  {18, 18, 18, 7, 5},   {19, 17, 20, 19, 17}, {40, 22, 40, 20, 11},
                            {641, 3, 700, 3, 1},   {6, 41, 8, 5, 40},    {23, 23, 24, 1, 1},   {101, 99, 102, 37, 29},
                            {74, 9, 76, 37, 4},    {3842, 5, 3842, 1921, 2}, {2, 1, 2, 1, 1}, {100, 50, 104, 33, 17}};
    for (const auto& [sw, sh, stride, dw, dh] : cases) {
        const Bytes src = noise(size_t(sh) * stride * 2, uint32_t(sw * 131 + sh));
        EXPECT_EQ(scale(src, sw, sh, stride, dw, dh), reference(src, sw, sh, stride, dw, dh))
            << sw << "x" << sh << " to " << dw << "x" << dh;
    }
}

TEST(DownScale, RefusesBadArgumentsAndWritesNothing) {
    NoLeak no_leak;
    const Bytes src(128, 7);
    Bytes dst(256, 0x5A);
    const auto code = [&](const uint8_t* s, int sw, int sh, int stride, uint8_t* d, int dw, int dh) {
        eko_SetError(EKO_OK);
        __eko_jpeg_enc_down_scale_yuv422(s, sw, sh, stride, d, dw, dh);
        return eko_GetLastError();
    };
    const uint8_t* s = src.data();
    uint8_t* d = dst.data();
    const std::vector<uint32_t> codes{code(s, 8, 8, 8, d, 9, 4), code(s, 8, 8, 8, d, 4, 9),  // enlargement
                                      code(s, 8, 8, 7, d, 4, 4), code(s, 7, 8, 7, d, 4, 4),  // short stride
                                      code(s, 0, 8, 8, d, 4, 4), code(s, 8, -1, 8, d, 4, 4), code(s, 8, 8, 8, d, 0, 4),
                                      code(s, 8, 8, 8, d, 4, -3), code(nullptr, 8, 8, 8, d, 4, 4),
                                      code(s, 8, 8, 8, nullptr, 4, 4)};
    EXPECT_EQ(codes, std::vector<uint32_t>(10, EKO_ERR_ARGUMENT));
    fail_allocation(0);
    EXPECT_EQ(code(s, 8, 8, 8, d, 4, 4), EKO_ERR_ALLOC);
    EXPECT_EQ(dst, Bytes(256, 0x5A));
}

TEST(DownScale, OutputEncodesAsPlanarYuv420) {
    const int sw = 160, sh = 120, dw = 75, dh = 45;
    Bytes packed(size_t(sw) * 2 * sh);  // a smooth gradient with neutral chroma
    for (size_t i = 0; i < packed.size(); ++i) packed[i] = i % 2 ? 128 : uint8_t((i / 2) % sw + (i / 4 / sw) / 2);
    const Bytes small = scale(packed, sw, sh, sw, dw, dh);
    const Decoded d = decode_jpeg(encode_to_memory(image_info(small.data(), dw, dh, 2), 95), true);
    ASSERT_TRUE(d.ok && !d.warning && d.width == dw && d.height == dh) << d.message;
    EXPECT_GT(psnr(small.data(), d.pixels.data(), size_t(dw) * dh), 40.0);
}

}  // namespace
