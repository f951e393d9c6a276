// A packed 4:2:2 frame encoded through the exported coding steps with either
// packed reader, decoded by libjpeg-turbo and compared with the source.
#include <TekoJEncoder.h>

#include "support/fault_os_layer.h"
#include "support/test_support.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstring>

namespace {

using tekoj_test::Bytes;

// JFIF RGB to packed Y0 U Y1 V; each group's chroma is the mean of its two
// pixels. An odd width's last pixel has no group and is left out.
Bytes packed_from_rgb(const Bytes& rgb, int w, int h) {
    Bytes out;
    auto px = [&](int x, int y, int c) { return double(rgb[(size_t(y) * w + x) * 3 + c]); };
    auto clamp8 = [](double v) { return static_cast<uint8_t>(std::lround(std::fmin(255.0, std::fmax(0.0, v)))); };
    for (int y = 0; y < h; ++y)
        for (int k = 0; k < w / 2; ++k) {
            double luma[2], cb = 0, cr = 0;
            for (int i = 0; i < 2; ++i) {
                const double r = px(2 * k + i, y, 0), g = px(2 * k + i, y, 1), b = px(2 * k + i, y, 2);
                luma[i] = 0.299 * r + 0.587 * g + 0.114 * b;
                cb += (-0.168736 * r - 0.331264 * g + 0.5 * b) / 2;
                cr += (0.5 * r - 0.418688 * g - 0.081312 * b) / 2;
            }
            out.insert(out.end(), {clamp8(luma[0]), clamp8(cb + 128), clamp8(luma[1]), clamp8(cr + 128)});
        }
    return out;
}

// Encodes through initialisation, header, one reader call and one coding
// pass per band, end mark; returns the stream.
Bytes encode_packed(const Bytes& packed, int w, int h, bool keep422) {
    ImageInfo info{};
    info.width = w;
    info.height = h;
    info.data = packed.data();
    info.format = EKO_FORMAT_YUV420;
    OutputRequest request{EKO_OUTPUT_MEMORY, nullptr, static_cast<uint8_t*>(DORVATEKO_OsMalloc(4096)), 4096};
    EncodeOptions options{90, nullptr, 0};
    EncoderSettings settings{};
    settings.num_components = 3;
    settings.num_quant_tables = 2;
    std::memset(settings.quant_tables[0], 3, 64);
    std::memset(settings.quant_tables[1], 4, 64);
    settings.write_dri = 1;
    const uint8_t specs[3][3] = {{0, 2, 1}, {1, 1, 1}, {1, 1, 1}};
    std::memcpy(settings.component_specs, specs, sizeof specs);

    EncoderContext* ctx = __eko_jpeg_enc_initiaize(&info, &request, &options, keep422 ? &settings : nullptr);
    EXPECT_NE(ctx, nullptr);
    if (ctx == nullptr) {
        DORVATEKO_OsFree(request.buffer);
        return {};
    }
    EXPECT_EQ(ctx->read_ptr, packed.data());
    EXPECT_EQ(__eko_jpeg_enc_make_header(ctx), 1u);
    for (uint32_t band = 0; band < ctx->total_imcu_rows; ++band) {
        EXPECT_EQ(keep422 ? __eko_jpeg_enc_get_raw_duoview422_data_for_yuv422(ctx)
                          : __eko_jpeg_enc_get_raw_duoview422_data(ctx),
                  1u);
        __eko_jpeg_enc_compress_data(ctx, ctx->sample_rows->row_arrays);
        ctx->sample_rows->band_counter++;
    }
    // Exactly the frame has been consumed, no byte beyond it.
    EXPECT_EQ(ctx->read_ptr, packed.data() + packed.size());
    __eko_jpeg_enc_make_end_mark(ctx);
    Bytes stream(ctx->output->buffer, ctx->output->buffer + ctx->output->total);
    uint8_t* buffer = ctx->output->buffer;
    __eko_jpeg_enc_release_mem(ctx);
    DORVATEKO_OsFree(ctx);
    DORVATEKO_OsFree(buffer);
    return stream;
}

TEST(Packed422Encode, DecodesCloseToTheSource) {
    tekoj_test::FaultScope scope;
    struct Case {
        int w, h;
        bool keep422;
    } cases[] = {{96, 64, false}, {70, 45, false}, {71, 33, true}, {64, 24, true}, {2, 1, false}, {3, 5, true}};
    for (const Case& c : cases) {
        // A crop of a larger photo: smooth at pixel scale, as camera frames are.
        const Bytes big = tekoj_test::photo_rgb(128, 96, 11);
        Bytes rgb;
        for (int y = 0; y < c.h; ++y)
            rgb.insert(rgb.end(), big.begin() + size_t(y) * 128 * 3, big.begin() + (size_t(y) * 128 + c.w) * 3);
        // The encoded image ends one column early for odd widths; the packed
        // rows simply hold no group for the last pixel.
        const Bytes packed = packed_from_rgb(rgb, c.w, c.h);
        const Bytes jpeg = encode_packed(packed, c.w, c.h, c.keep422);
        ASSERT_FALSE(jpeg.empty());
        const tekoj_test::Decoded d = tekoj_test::decode_jpeg(jpeg);
        ASSERT_TRUE(d.ok && !d.warning) << c.w << "x" << c.h << ": " << d.message;
        ASSERT_EQ(d.width, c.w);
        ASSERT_EQ(d.height, c.h);
        // Compare the columns that the packed frame describes.
        const int cols = c.w & ~1;
        Bytes a, b;
        for (int y = 0; y < c.h; ++y) {
            const size_t row = size_t(y) * c.w * 3;
            a.insert(a.end(), rgb.begin() + row, rgb.begin() + row + cols * 3);
            b.insert(b.end(), d.pixels.begin() + row, d.pixels.begin() + row + cols * 3);
        }
        EXPECT_GT(tekoj_test::psnr(a.data(), b.data(), a.size()), 30.0)
            << c.w << "x" << c.h << (c.keep422 ? " 4:2:2" : " 4:2:0");
        // The repeated last column looks like its neighbour.
        for (int y = 0; (c.w & 1) && y < c.h; ++y) {
            for (int i = 0; i < 3; ++i) {
                EXPECT_NEAR(d.pixels[(size_t(y) * c.w + c.w - 1) * 3 + i],
                            d.pixels[(size_t(y) * c.w + c.w - 2) * 3 + i], 12);
            }
        }
    }
    EXPECT_EQ(tekoj_test::live_blocks(), 0);
}

}  // namespace
