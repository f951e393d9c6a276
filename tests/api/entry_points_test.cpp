// Whole-image entry points: streams decode cleanly for every format, size and
// quality; every output kind yields the same bytes; bands coded by separate
// calls join to the one-call stream; concurrent calls do not interfere.
#include <TekoJEncoderInternal.h>

#include "support/fault_os_layer.h"
#include "support/test_support.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <thread>
#include <vector>

using namespace tekoj_test;

namespace {

constexpr uint32_t kFormats[] = {EKO_FORMAT_RGB565, EKO_FORMAT_RGB888,   EKO_FORMAT_YUV420,
                                 EKO_FORMAT_GREY,   EKO_FORMAT_RGBA8888, EKO_FORMAT_BGRA8888};

std::string describe(uint32_t format, int w, int h, uint32_t q) {
    return "format " + std::to_string(format) + " " + std::to_string(w) + "x" + std::to_string(h) + " q" +
           std::to_string(q);
}

// Collects the stream into (bytes, largest piece); returns 0 for every piece,
// as the callback's result must not matter.
uint32_t collect(void* arg, const uint8_t* data, uint32_t count) {
    auto* sink = static_cast<std::pair<Bytes, uint32_t>*>(arg);
    sink->first.insert(sink->first.end(), data, data + count);
    sink->second = std::max(sink->second, count);
    return 0;
}

// The pixels of rows [top, top + rows) of an image, laid out as a band image
// of the same format (planar 4:2:0 gets its own three planes).
Bytes band_pixels(const Bytes& px, uint32_t format, int w, int h, int top, int rows) {
    const size_t row = format == EKO_FORMAT_YUV420 ? size_t(w) : image_size(format, w, 1);
    Bytes out(px.begin() + long(row * top), px.begin() + long(row * (top + rows)));
    const size_t cw = (w + 1) / 2, ch = (h + 1) / 2;
    for (size_t plane = 0; format == EKO_FORMAT_YUV420 && plane < 2; ++plane) {
        auto first = px.begin() + long(size_t(w) * h + plane * cw * ch + cw * (top / 2));
        out.insert(out.end(), first, first + long(cw * ((rows + 1) / 2)));
    }
    return out;
}

}  // namespace

TEST(EntryPoints, EveryFormatSizeAndQualityDecodesAboveThePsnrFloor) {
    // Floors measured on the 128x96 photo-like image, set a little below:
    // colour (all five RGB/YUV layouts, 4:2:0) and grey, per quality.
    const struct { uint32_t quality; double colour, grey; } floors[] = {
        {1, 18.4, 26.9}, {50, 34.2, 39.1}, {75, 36.8, 40.1}, {90, 38.6, 41.2}, {100, 42.7, 50.2}};
    const int sizes[][2] = {{1, 1}, {16, 16}, {17, 20}, {33, 17}, {1, 49999}, {49999, 1}, {128, 96}};
    for (const auto& s : sizes) {
        const Bytes rgb = photo_rgb(s[0], s[1], 7);
        for (uint32_t format : kFormats) {
            const Bytes px = rgb_to_format(rgb, s[0], s[1], format);
            const Bytes& reference = format == EKO_FORMAT_GREY ? px : rgb;
            for (const auto& f : floors) {
                SCOPED_TRACE(describe(format, s[0], s[1], f.quality));
                const Bytes jpeg = encode_to_memory(image_info(px.data(), s[0], s[1], format), f.quality);
                ASSERT_TRUE(jpeg.size() > 2 && jpeg[jpeg.size() - 2] == 0xFF && jpeg.back() == 0xD9);
                const Decoded d = decode_jpeg(jpeg);
                ASSERT_TRUE(d.ok && !d.warning) << d.message;
                EXPECT_TRUE(d.width == s[0] && d.height == s[1] && d.components == (format == EKO_FORMAT_GREY ? 1 : 3));
                ASSERT_EQ(d.pixels.size(), reference.size());
                if (s[0] == 128) {
                    EXPECT_GE(psnr(reference.data(), d.pixels.data(), reference.size()),
                              format == EKO_FORMAT_GREY ? f.grey : f.colour);
                }
            }
        }
    }
}

TEST(EntryPoints, EveryOutputKindGivesTheSameBytesInFourThreadsAtOnce) {
    struct Job { uint32_t format; int w, h; uint32_t quality; Bytes pixels, expected; };
    std::vector<Job> jobs = {{EKO_FORMAT_YUV420, 300, 200, 90, {}, {}}, {EKO_FORMAT_RGB565, 33, 17, 75, {}, {}},
                             {EKO_FORMAT_GREY, 1, 3001, 100, {}, {}},   {EKO_FORMAT_RGBA8888, 77, 77, 40, {}, {}}};
    for (Job& j : jobs) {
        j.pixels = rgb_to_format(photo_rgb(j.w, j.h, 11), j.w, j.h, j.format);
        j.expected = encode_to_memory(image_info(j.pixels.data(), j.w, j.h, j.format), j.quality);
    }
    const int64_t live_before = live_blocks();
    std::vector<std::thread> threads;
    for (const Job& j : jobs) threads.emplace_back([&j] {
        SCOPED_TRACE(describe(j.format, j.w, j.h, j.quality));
        const ImageInfo info = image_info(j.pixels.data(), j.w, j.h, j.format);
        const EncodeOptions options{j.quality, nullptr, 0};
        // Memory: small, missing (with a claimed length) and fitting blocks.
        for (int32_t start : {0, 100, 1 << 20}) {
            for (int member = 0; member < 6; ++member) {
                uint8_t* block = member % 2 ? nullptr : static_cast<uint8_t*>(DORVATEKO_OsMalloc(start ? start : 1));
                int32_t length = start;
                OutputRequest request{99, nullptr, block, static_cast<uint32_t>(start)};  // kind ignored
                const uint32_t r = member < 2    ? eko_enc_jpeg_to_buffer(&info, &block, &length, j.quality)
                                   : member < 4  ? eko_enc_jpeg_to_buffer_ex(&info, &block, &length, &options)
                                   : member == 4 ? eko_enc_jpeg_to_buffer_full_buffer(&info, &request, j.quality)
                                                 : eko_enc_jpeg_to_buffer_ex_full_buffer(&info, &request, &options);
                if (member >= 4) block = request.buffer;  // the stream and its length, not the block size
                if (member >= 4) length = static_cast<int32_t>(request.capacity);
                EXPECT_TRUE(r == 1 && Bytes(block, block + length) == j.expected) << member << " " << start;
                DORVATEKO_OsFree(block);
            }
        }
        // Files by name and by handle (complete, so the handle was closed),
        // then streams in consecutive pieces of at most 4096 bytes.
        const std::string path = temp_path("kinds" + std::to_string(j.format) + ".jpg");
        for (int way = 0; way < 6; ++way) {
            std::remove(path.c_str());
            OutputRequest request{EKO_OUTPUT_FILE, way / 2 == 1 ? DORVATEKO_OsFopen(path.c_str(), "wb") : nullptr, nullptr, 0};
            std::pair<Bytes, uint32_t> sink;
            const uint32_t r = way == 0   ? eko_enc_jpeg_to_file(&info, path.c_str(), j.quality)
                               : way == 1 ? eko_enc_jpeg_to_file_ex(&info, path.c_str(), &options)
                               : way == 2 ? eko_enc_jpeg_to_file_full_buffer(&info, &request, j.quality)
                               : way == 3 ? eko_enc_jpeg_to_file_ex_full_buffer(&info, &request, &options)
                               : way == 4 ? eko_enc_jpeg_to_stream(&info, collect, j.quality, &sink)
                                          : eko_enc_jpeg_to_stream_ex(&info, collect, &options, &sink);
            EXPECT_TRUE(r == 1 && (way < 4 ? read_file(path) : sink.first) == j.expected) << way;
            EXPECT_LE(sink.second, 4096u);
        }
        std::remove(path.c_str());
    });
    for (auto& t : threads) t.join();
    EXPECT_EQ(live_blocks(), live_before);
}

TEST(BandMode, BandsJoinToTheOneCallStreamEachLaterOneOpeningWithItsRestartMarker) {
    const struct { uint32_t format; int w; std::vector<int> heights; uint32_t quality; } cases[] = {
        {EKO_FORMAT_YUV420, 37, {16, 16, 13}, 75},  {EKO_FORMAT_GREY, 1, {40, 8, 8, 3}, 100},
        {EKO_FORMAT_RGB565, 33, {32, 3}, 80},       {EKO_FORMAT_RGB888, 17, {16, 16, 16, 16, 16, 16, 16, 16, 16, 7}, 60},
        {EKO_FORMAT_RGBA8888, 50, {48, 17}, 100},   {EKO_FORMAT_BGRA8888, 16, {16}, 30},
    };
    for (const auto& c : cases) {
        int h = 0;
        for (int b : c.heights) h += b;
        SCOPED_TRACE(describe(c.format, c.w, h, c.quality) + " in " + std::to_string(c.heights.size()) + " bands");
        const Bytes px = rgb_to_format(photo_rgb(c.w, h, 5), c.w, h, c.format);
        Bytes joined;
        int top = 0;
        for (size_t b = 0; b < c.heights.size(); ++b) {
            const Bytes band = band_pixels(px, c.format, c.w, h, top, c.heights[b]);
            const bool last = b + 1 == c.heights.size();
            const ImageInfo info{c.w, c.heights[b], band.data(), 1, b > 0, !last, h, top, c.format, nullptr};
            const Bytes piece = encode_to_memory(info, c.quality);
            ASSERT_GT(piece.size(), 2u);
            const int mcu_rows_before = top / (c.format == EKO_FORMAT_GREY ? 8 : 16);
            EXPECT_TRUE(b == 0 || (piece[0] == 0xFF && piece[1] == 0xD0 + (mcu_rows_before - 1) % 8)) << b;
            EXPECT_EQ(piece[piece.size() - 2] == 0xFF && piece.back() == 0xD9, last) << b;
            joined.insert(joined.end(), piece.begin(), piece.end());
            top += c.heights[b];
        }
        EXPECT_EQ(joined, encode_to_memory(image_info(px.data(), c.w, h, c.format), c.quality));
    }
}

TEST(BandMode, RefusesBandWordsThatCannotDescribeOneStream) {
    const struct { const char* what; uint32_t format; int h; uint32_t continued, open; int total, top; } cases[] = {
        {"later colour band off the MCU-row grid", EKO_FORMAT_RGB888, 16, 1, 1, 0, 8},
        {"first colour band of 10 rows with more to follow", EKO_FORMAT_YUV420, 10, 0, 1, 64, 0},
        {"first band taller than the image", EKO_FORMAT_RGB888, 32, 0, 1, 16, 0},
    };
    const Bytes px(image_size(EKO_FORMAT_RGB888, 32, 32), 0x80);
    const EncodeOptions options{75, nullptr, 0};
    for (const auto& c : cases) {
        SCOPED_TRACE(c.what);
        const ImageInfo info{32, c.h, px.data(), 1, c.continued, c.open, c.total, c.top, c.format, nullptr};
        uint8_t* const block = static_cast<uint8_t*>(DORVATEKO_OsMalloc(4096));
        const int64_t live = live_blocks();
        uint8_t* buffer = block;
        int32_t length = 4096;
        EXPECT_EQ(eko_enc_jpeg_to_buffer_ex(&info, &buffer, &length, &options), 0u);
        EXPECT_TRUE(buffer == block && length == 4096);
        EXPECT_EQ(live_blocks(), live);  // the caller's block is still the caller's
        DORVATEKO_OsFree(block);
    }
}
