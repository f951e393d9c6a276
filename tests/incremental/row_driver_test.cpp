// The row entropy driver: the library's own coefficients give the pixel
// path's stream; coefficients baseline JPEG cannot code are refused whole.
#include "incremental/incremental_support.h"

#include <gtest/gtest.h>

using namespace tekoj_test;

TEST(RowDriver, LibraryCoefficientsGiveThePixelStream) {
    struct Case { uint32_t format; int width, height; bool settings; };
    for (const Case c : {Case{2, 37, 21, false}, Case{4, 33, 17, false}, Case{1, 50, 33, false}, Case{0, 1, 7, false},
                         Case{2, 40, 36, true}, Case{8, 31, 9, true}}) {
        SCOPED_TRACE(::testing::Message() << c.format << " " << c.width << "x" << c.height);
        const Bytes rgb = photo_rgb(c.width, c.height, 3);
        const Bytes pixels = rgb_to_format(rgb, c.width, c.height, c.format);
        const ImageInfo info = image_info(pixels.data(), c.width, c.height, c.format);
        const EncoderSettings s = settings_420();
        const EncoderSettings* settings = c.settings ? &s : nullptr;
        const auto coefficients = library_coefficients(info, settings, 85);
        ASSERT_FALSE(coefficients.empty());
        const Planes planes = band_planes(rgb, pixels, c.width, c.height, c.format);
        const Bytes pixel_stream = encode_bands(info, planes.y.empty() ? nullptr : &planes, 85, Sink::Memory, settings);
        ASSERT_FALSE(pixel_stream.empty());
        if (!c.settings) {
            EXPECT_EQ(pixel_stream, encode_to_memory(info, 85));
        }
        EXPECT_EQ(encode_coefficients(info, settings, 85, coefficients, Sink::Memory, false), pixel_stream);
    }
}

TEST(RowDriver, GoldenCoefficientsCaseMatches) {
    int w = 0, h = 0;
    uint32_t quality = 0;
    const EncoderSettings s = golden_settings("colsplit-yuv420-40x36-q60", w, h, quality);
    const Bytes raw = read_file(golden_path("colsplit-yuv420-40x36-q60.in"));
    const Bytes expected = read_file(golden_path("colsplit-yuv420-40x36-q60.expected"));
    std::vector<int16_t> coefficients(raw.size() / 2);
    for (size_t i = 0; i < coefficients.size(); ++i)
        coefficients[i] = static_cast<int16_t>(raw[2 * i] | raw[2 * i + 1] << 8);
    const ImageInfo info = image_info(nullptr, w, h, EKO_FORMAT_YUV420);
    EXPECT_EQ(encode_coefficients(info, &s, quality, coefficients, Sink::Memory, false), expected);
    for (Sink sink : {Sink::Memory, Sink::File, Sink::Stream})
        EXPECT_EQ(encode_coefficients(info, &s, quality, coefficients, sink, true), expected);
}

TEST(RowDriver, UncodableCoefficientsAreRefusedBeforeAnyByte) {
    // Grey 24x16: three MCUs per band, two bands.
    const ImageInfo info = image_info(nullptr, 24, 16, EKO_FORMAT_GREY);
    const EncoderSettings s = [] {
        EncoderSettings g = settings_420(0, 1, 1, 1);
        g.num_components = 1;
        return g;
    }();
    std::vector<int16_t> good(6 * 64, 0);
    for (int k = 0; k < 6; ++k) {
        good[k * 64] = static_cast<int16_t>(k % 2 == 0 ? 1000 : -1000);
        good[k * 64 + 1] = -1023;
    }
    const Bytes reference = encode_coefficients(info, &s, 75, good, Sink::Memory, false);
    ASSERT_FALSE(reference.empty());
    EXPECT_EQ(encode_coefficients(info, &s, 75, good, Sink::Memory, true), reference);

    // A DC difference of 2048 in the band's third MCU, then an AC of 1024;
    // and a DC of 2048 right after a restart (its predictor is 0 there).
    struct Bad { uint32_t mcu, index; int16_t value; };
    for (const Bad bad : {Bad{2, 0, 1048}, Bad{1, 5, 1024}, Bad{3, 0, 2048}}) {
        for (bool columns : {false, true}) {
            SCOPED_TRACE(::testing::Message() << bad.mcu << " " << columns);
            auto coefficients = good;
            coefficients[bad.mcu * 64 + bad.index] = bad.value;
            Output out(Sink::Memory);
            const EncodeOptions options{75, nullptr, 0};
            EncoderContext* ctx = eko_jpeg_enc_mcu_init(&info, &out.request, &options, &s);
            ASSERT_TRUE(out.attach(ctx) && ctx != nullptr);
            uint8_t* buffer = nullptr;
            uint32_t before = 0, after = 0, next = 0;
            if (columns) {
                ASSERT_EQ(__eko_jpeg_enc_col_encoder_init(ctx), 1u);
            }
            // Code up to the bad MCU's band (rows) or column, then hand it in.
            const uint32_t unit = columns ? bad.mcu % 3 : bad.mcu / 3;
            auto lists = [&](uint32_t u, std::vector<int16_t>& c) {
                return columns ? block_lists(c, 1, u, 2, 3) : block_lists(c, 1, u * 3, 3, 1);
            };
            auto code = [&](uint32_t u, std::vector<int16_t>& c) {
                auto l = lists(u, c);
                return columns ? __eko_jpeg_enc_col_entroy_encoder(ctx, l.data(), &next)
                               : __eko_jpeg_enc_entroy_encoder(ctx, l.data(), &next);
            };
            for (uint32_t u = 0; u < unit; ++u) ASSERT_EQ(code(u, coefficients), 1u);
            eko_jpeg_enc_mcu__get_encdata(ctx, &buffer, &before);
            const Bytes snapshot(buffer, buffer + before);
            EXPECT_EQ(code(unit, coefficients), 0u);
            eko_jpeg_enc_mcu__get_encdata(ctx, &buffer, &after);
            EXPECT_EQ(Bytes(buffer, buffer + after), snapshot);
            // Corrected, the same unit goes through and the stream is whole.
            auto fixed = good;
            for (uint32_t u = unit; u < (columns ? 3u : 2u); ++u) ASSERT_EQ(code(u, fixed), 1u);
            if (columns) {
                ASSERT_EQ(__eko_jpeg_enc_col_encoder_finish(ctx), 1u);
            }
            EXPECT_EQ(out.finish(ctx), reference);
        }
    }
}
