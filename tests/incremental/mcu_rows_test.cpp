// The MCU-row interface: band-by-band streams against whole-image streams,
// the golden case, and calls that must be refused without touching the
// stream.
#include "incremental/incremental_support.h"
#include "support/fault_os_layer.h"

#include <gtest/gtest.h>

using namespace tekoj_test;


TEST(McuRows, BandByBandEqualsTheWholeImageStream) {
    struct Case { uint32_t format; int width, height; };
    for (const Case c : {Case{2, 37, 21}, Case{2, 16, 16}, Case{2, 101, 100}, Case{4, 33, 17}, Case{4, 17, 100},
                         Case{0, 17, 20}, Case{1, 50, 33}, Case{7, 7, 5}, Case{8, 31, 9}}) {
        SCOPED_TRACE(::testing::Message() << c.format << " " << c.width << "x" << c.height);
        const Bytes rgb = photo_rgb(c.width, c.height, 7);
        const Bytes pixels = rgb_to_format(rgb, c.width, c.height, c.format);
        const ImageInfo info = image_info(pixels.data(), c.width, c.height, c.format);
        const Planes planes = band_planes(rgb, pixels, c.width, c.height, c.format);
        const bool planar = !planes.y.empty();
        const Bytes whole = encode_to_memory(info, 75);
        ASSERT_FALSE(whole.empty());
        EXPECT_EQ(encode_bands(info, planar ? &planes : nullptr, 75, Sink::Memory), whole);
        if (c.format == EKO_FORMAT_YUV420 || c.format == EKO_FORMAT_RGB888) {
            EXPECT_EQ(encode_bands(info, planar ? &planes : nullptr, 75, Sink::File), whole);
            EXPECT_EQ(encode_bands(info, planar ? &planes : nullptr, 75, Sink::Stream), whole);
        }
        const Decoded d = decode_jpeg(whole);
        EXPECT_TRUE(d.ok && !d.warning) << d.message;
    }
}

TEST(McuRows, GoldenYuv422CaseMatches) {
    int w = 0, h = 0;
    uint32_t quality = 0;
    const EncoderSettings s = golden_settings("mcurows-yuv422-37x21-q70", w, h, quality);
    const Bytes input = read_file(golden_path("mcurows-yuv422-37x21-q70.in"));
    Planes p;
    p.width = w, p.height = h, p.chroma_width = (w + 1) / 2, p.chroma_height = h;  // 4:2:2 planes
    const size_t ny = static_cast<size_t>(w) * h, nc = static_cast<size_t>(p.chroma_width) * h;
    ASSERT_EQ(input.size(), ny + 2 * nc);
    p.y.assign(input.begin(), input.begin() + ny);
    p.u.assign(input.begin() + ny, input.begin() + ny + nc);
    p.v.assign(input.begin() + ny + nc, input.end());
    const ImageInfo info = image_info(input.data(), w, h, EKO_FORMAT_YUV420);
    EXPECT_EQ(encode_bands(info, &p, quality, Sink::Memory, &s),
              read_file(golden_path("mcurows-yuv422-37x21-q70.expected")));
}

TEST(McuRows, HeaderOnlyAfterInitAndNeverApp1) {
    const Bytes rgb = photo_rgb(24, 20);
    ExifInfo exif{};
    exif.make = "ignored";
    ImageInfo info = image_info(rgb.data(), 24, 20, EKO_FORMAT_RGB888);
    info.exif_info = &exif;
    Output out(Sink::Memory);
    const EncodeOptions options{80, nullptr, 0};
    EncoderContext* ctx = eko_jpeg_enc_mcu_init(&info, &out.request, &options, nullptr);
    ASSERT_TRUE(out.attach(ctx) && ctx != nullptr);
    uint8_t* buffer = nullptr;
    uint32_t length = 0;
    EXPECT_EQ(eko_jpeg_enc_mcu__get_encdata(ctx, &buffer, &length), buffer);
    ASSERT_GT(length, 100u);
    EXPECT_EQ(buffer[3], 0xE0);                                          // JFIF APP0 first
    EXPECT_TRUE(buffer[length - 14] == 0xFF && buffer[length - 13] == 0xDA);  // SOS closes it
    info.exif_info = nullptr;
    const Bytes whole = encode_to_memory(info, 80);
    uint32_t next = 0;
    while (next < 20) ASSERT_EQ(eko_jpeg_enc_muc_process(ctx, nullptr, &next), 1u);
    EXPECT_EQ(out.finish(ctx), whole);
}

TEST(McuRows, MisuseIsRefusedAndWritesNothing) {
    FaultScope scope;
    const int64_t live = live_blocks();
    {
        const Bytes rgb = photo_rgb(40, 20);
        Planes p = yuv420_planes(rgb, 40, 20);
        const Bytes yuv = rgb_to_yuv420(rgb, 40, 20);
        const ImageInfo info = image_info(yuv.data(), 40, 20, EKO_FORMAT_YUV420);
        const EncodeOptions options{75, nullptr, 0};

        // Chroma rows that overrun the band buffer's regions (4:4:4, or chroma
        // doubled vertically) are refused at creation; 4:2:2 is served.
        for (const auto& [h, v, accepted] : {std::tuple{1, 1, false}, {1, 2, false}, {2, 1, true}}) {
            Output out(Sink::Memory);
            const EncoderSettings s = settings_420(0, 1, static_cast<uint8_t>(h), static_cast<uint8_t>(v));
            EncoderContext* ctx = eko_jpeg_enc_mcu_init(&info, &out.request, &options, &s);
            EXPECT_EQ(ctx != nullptr, accepted);
            if (ctx == nullptr) {
                EXPECT_EQ(eko_GetLastError(), uint32_t{EKO_ERR_SAMPLING});
            }
            out.attach(ctx);
            if (ctx != nullptr) out.finish(ctx);
        }

        Output out(Sink::Stream);
        EncoderContext* ctx = eko_jpeg_enc_mcu_init(&info, &out.request, &options, nullptr);
        ASSERT_NE(ctx, nullptr);
        uint8_t* buffer = nullptr;
        uint32_t length = 0, next = 0;
        const Bytes band0 = band_buffer(p, 0, 16, 8), band1 = band_buffer(p, 1, 16, 8);
        // No callback yet: nothing may be coded.
        EXPECT_EQ(eko_jpeg_enc_muc_process(ctx, band0.data(), &next), 0u);
        EXPECT_EQ(eko_jpeg_enc_mcu_set_stream(ctx, nullptr, nullptr), 0u);
        ASSERT_TRUE(out.attach(ctx));
        EXPECT_EQ(eko_jpeg_enc_muc_process(nullptr, band0.data(), &next), 0u);
        EXPECT_EQ(eko_jpeg_enc_muc_process(ctx, nullptr, &next), 0u);
        EXPECT_EQ(eko_jpeg_enc_muc_process(ctx, band0.data(), nullptr), 0u);
        EXPECT_EQ(eko_jpeg_enc_mcu__get_encdata(nullptr, &buffer, &length), nullptr);
        EXPECT_EQ(eko_jpeg_enc_mcu__get_encdata(ctx, nullptr, &length), nullptr);
        EXPECT_EQ(eko_jpeg_enc_muc_process(ctx, band0.data(), &next), 1u);
        // Bytes may already have gone to the first callback: no switching now.
        auto other = +[](void*, const uint8_t*, uint32_t n) -> uint32_t { return n; };
        EXPECT_EQ(eko_jpeg_enc_mcu_set_stream(ctx, other, nullptr), 0u);
        EXPECT_EQ(eko_jpeg_enc_muc_process(ctx, band1.data(), &next), 1u);
        eko_jpeg_enc_mcu__get_encdata(ctx, &buffer, &length);
        const Bytes before(buffer, buffer + length);
        // A band after the last one.
        EXPECT_EQ(eko_jpeg_enc_muc_process(ctx, band1.data(), &next), 0u);
        EXPECT_EQ(eko_GetLastError(), uint32_t{EKO_ERR_STATE});
        EXPECT_EQ(next, 32u);
        eko_jpeg_enc_mcu__get_encdata(ctx, &buffer, &length);
        EXPECT_EQ(Bytes(buffer, buffer + length), before);
        const Bytes stream = out.finish(ctx);
        EXPECT_EQ(stream, encode_to_memory(info, 75));
        eko_jpeg_enc_mcu_finish(nullptr, nullptr, nullptr);
    }
    EXPECT_EQ(live_blocks(), live);
}

TEST(McuRows, FailedOutputStopsTheEncodeAndHandsBackNothing) {
    FaultScope scope;
    const int64_t live = live_blocks();
    {
        const Bytes rgb = photo_rgb(128, 128);
        const ImageInfo info = image_info(rgb.data(), 128, 128, EKO_FORMAT_RGB888);
        const EncodeOptions options{95, nullptr, 0};
        Output out(Sink::File);
        EncoderContext* ctx = eko_jpeg_enc_mcu_init(&info, &out.request, &options, nullptr);
        ASSERT_TRUE(out.attach(ctx));
        fail_writes_after(100);
        uint32_t next = 0, results = 0;
        for (int b = 0; b < 8; ++b) results += eko_jpeg_enc_muc_process(ctx, nullptr, &next);
        EXPECT_LT(results, 8u);  // the first hand-on came up short
        uint8_t* buffer = nullptr;
        uint32_t length = 0;
        EXPECT_EQ(eko_jpeg_enc_mcu__get_encdata(ctx, &buffer, &length), nullptr);
        EXPECT_EQ(out.finish(ctx), Bytes{});
    }
    EXPECT_EQ(live_blocks(), live);
}
