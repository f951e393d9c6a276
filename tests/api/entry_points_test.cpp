// Whole-image entry points: streams decode cleanly for every format, size and
// quality; every output kind yields the same bytes; bands coded by separate
// calls join to the one-call stream; concurrent calls do not interfere.
#include <TekoJEncoder.h>

#include "support/fault_os_layer.h"
#include "support/test_support.h"

#include <gtest/gtest.h>

#include <cstring>
#include <string>
#include <thread>
#include <vector>

using namespace tekoj_test;

namespace {

constexpr uint32_t kFormats[] = {EKO_FORMAT_RGB565, EKO_FORMAT_RGB888,   EKO_FORMAT_YUV420,
                                 EKO_FORMAT_GREY,   EKO_FORMAT_RGBA8888, EKO_FORMAT_BGRA8888};
constexpr uint32_t kQualities[] = {1, 50, 75, 90, 100};

std::string describe(uint32_t format, int w, int h, uint32_t q) {
    return "format " + std::to_string(format) + " " + std::to_string(w) + "x" + std::to_string(h) + " q" +
           std::to_string(q);
}

struct StreamSink {
    Bytes bytes;
    std::vector<uint32_t> pieces;
};

uint32_t collect(void* arg, const uint8_t* data, uint32_t count) {
    auto* sink = static_cast<StreamSink*>(arg);
    sink->bytes.insert(sink->bytes.end(), data, data + count);
    sink->pieces.push_back(count);
    return 0;  // a refusing callback: its result must not matter
}

// The pixels of rows [top, top + rows) of an image, laid out as a band image
// of the same format (planar 4:2:0 gets its own three planes).
Bytes band_pixels(const Bytes& px, uint32_t format, int w, int h, int top, int rows) {
    if (format != EKO_FORMAT_YUV420) {
        const size_t row = image_size(format, w, 1);
        return Bytes(px.begin() + static_cast<long>(row * top), px.begin() + static_cast<long>(row * (top + rows)));
    }
    const size_t cw = (w + 1) / 2, ch = (h + 1) / 2, crows = (rows + 1) / 2;
    Bytes out(px.begin() + static_cast<long>(size_t(w) * top), px.begin() + static_cast<long>(size_t(w) * (top + rows)));
    for (size_t plane = 0; plane < 2; ++plane) {
        auto first = px.begin() + static_cast<long>(size_t(w) * h + plane * cw * ch + cw * (top / 2));
        out.insert(out.end(), first, first + static_cast<long>(cw * crows));
    }
    return out;
}

// Codes the image as bands of the given heights, one call each.
std::vector<Bytes> encode_bands(const Bytes& px, uint32_t format, int w, int h, const std::vector<int>& heights,
                                uint32_t quality) {
    std::vector<Bytes> out;
    int top = 0;
    for (size_t b = 0; b < heights.size(); ++b) {
        const Bytes band = band_pixels(px, format, w, h, top, heights[b]);
        ImageInfo info = image_info(band.data(), w, heights[b], format);
        info.band_mode = 1;
        info.band_continued = b > 0;
        info.band_open_end = b + 1 < heights.size();
        info.total_height = h;
        info.band_top_row = top;
        out.push_back(encode_to_memory(info, quality));
        top += heights[b];
    }
    return out;
}

}  // namespace

TEST(EntryPoints, EveryFormatSizeAndQualityDecodesWithoutWarning) {
    const int sizes[][2] = {{1, 1}, {2, 2}, {15, 15}, {16, 16}, {17, 20}, {33, 17}, {1, 49999}, {49999, 1}};
    for (const auto& s : sizes) {
        const Bytes rgb = photo_rgb(s[0], s[1], 3);
        for (uint32_t format : kFormats) {
            const Bytes px = rgb_to_format(rgb, s[0], s[1], format);
            for (uint32_t q : kQualities) {
                SCOPED_TRACE(describe(format, s[0], s[1], q));
                const Bytes jpeg = encode_to_memory(image_info(px.data(), s[0], s[1], format), q);
                ASSERT_FALSE(jpeg.empty());
                const Decoded d = decode_jpeg(jpeg);
                ASSERT_TRUE(d.ok) << d.message;
                EXPECT_FALSE(d.warning) << d.message;
                EXPECT_EQ(d.width, s[0]);
                EXPECT_EQ(d.height, s[1]);
                EXPECT_EQ(d.components, format == EKO_FORMAT_GREY ? 1 : 3);
                EXPECT_EQ(jpeg[jpeg.size() - 2], 0xFF);
                EXPECT_EQ(jpeg.back(), 0xD9);
            }
        }
    }
}

TEST(EntryPoints, DecodedPixelsStayAboveThePsnrFloor) {
    // Measured on this photo-like image, floors set a little below: colour
    // (all five RGB/YUV layouts, 4:2:0) and grey, per quality.
    struct Floor {
        uint32_t quality;
        double colour, grey;
    };
    const Floor floors[] = {{1, 18.4, 26.9}, {50, 34.2, 39.1}, {75, 36.8, 40.1}, {90, 38.6, 41.2}, {100, 42.7, 50.2}};
    const int sizes[][2] = {{128, 96}, {1, 4999}, {4999, 1}};
    for (const auto& s : sizes) {
        const Bytes rgb = photo_rgb(s[0], s[1], 7);
        for (uint32_t format : kFormats) {
            const Bytes px = rgb_to_format(rgb, s[0], s[1], format);
            const Bytes& reference = format == EKO_FORMAT_GREY ? px : rgb;
            for (const Floor& f : floors) {
                SCOPED_TRACE(describe(format, s[0], s[1], f.quality));
                const Decoded d = decode_jpeg(encode_to_memory(image_info(px.data(), s[0], s[1], format), f.quality));
                ASSERT_TRUE(d.ok);
                ASSERT_EQ(d.pixels.size(), reference.size());
                EXPECT_GE(psnr(reference.data(), d.pixels.data(), reference.size()),
                          format == EKO_FORMAT_GREY ? f.grey : f.colour);
            }
        }
    }
}

TEST(EntryPoints, EveryOutputKindGivesTheSameBytes) {
    struct Case {
        uint32_t format;
        int w, h;
        uint32_t quality;
    };
    const Case cases[] = {{EKO_FORMAT_YUV420, 300, 200, 90}, {EKO_FORMAT_RGB888, 33, 17, 75},
                          {EKO_FORMAT_GREY, 1, 3001, 100}, {EKO_FORMAT_BGRA8888, 160, 48, 100}};
    for (const Case& c : cases) {
        SCOPED_TRACE(describe(c.format, c.w, c.h, c.quality));
        FaultScope scope;
        const int64_t live_before = live_blocks();
        const Bytes px = rgb_to_format(photo_rgb(c.w, c.h, 11), c.w, c.h, c.format);
        const ImageInfo info = image_info(px.data(), c.w, c.h, c.format);
        const EncodeOptions options{c.quality, nullptr, 0};
        const Bytes expected = encode_to_memory(info, c.quality);
        ASSERT_FALSE(expected.empty());

        // Memory: small, missing (with a claimed length) and fitting blocks.
        for (int32_t start : {0, 100, 2048, 1 << 20}) {
            for (int member = 0; member < 6; ++member) {
                SCOPED_TRACE("member " + std::to_string(member) + ", block of " + std::to_string(start));
                uint8_t* block = member % 2 ? nullptr : static_cast<uint8_t*>(DORVATEKO_OsMalloc(start ? start : 1));
                int32_t length = start;
                OutputRequest request{99, nullptr, block, static_cast<uint32_t>(start)};  // kind ignored
                uint32_t r = 0;
                if (member < 2) r = eko_enc_jpeg_to_buffer(&info, &block, &length, c.quality);
                if (member >= 2 && member < 4) r = eko_enc_jpeg_to_buffer_ex(&info, &block, &length, &options);
                if (member == 4) r = eko_enc_jpeg_to_buffer_full_buffer(&info, &request, c.quality);
                if (member == 5) r = eko_enc_jpeg_to_buffer_ex_full_buffer(&info, &request, &options);
                if (member >= 4) {
                    block = request.buffer;
                    length = static_cast<int32_t>(request.capacity);  // the stream length, not the block size
                }
                ASSERT_EQ(r, 1u);
                EXPECT_EQ(Bytes(block, block + length), expected);
                DORVATEKO_OsFree(block);
            }
        }

        // Files, by name and by handle.
        const std::string path = temp_path("kinds.jpg");
        ASSERT_EQ(eko_enc_jpeg_to_file(&info, path.c_str(), c.quality), 1u);
        EXPECT_EQ(read_file(path), expected);
        std::remove(path.c_str());
        ASSERT_EQ(eko_enc_jpeg_to_file_ex(&info, path.c_str(), &options), 1u);
        EXPECT_EQ(read_file(path), expected);
        for (int ex = 0; ex < 2; ++ex) {
            std::remove(path.c_str());
            OutputRequest request{EKO_OUTPUT_FILE, DORVATEKO_OsFopen(path.c_str(), "wb"), nullptr, 0};
            ASSERT_NE(request.file, nullptr);
            ASSERT_EQ(ex ? eko_enc_jpeg_to_file_ex_full_buffer(&info, &request, &options)
                         : eko_enc_jpeg_to_file_full_buffer(&info, &request, c.quality),
                      1u);
            EXPECT_EQ(read_file(path), expected);  // complete, so the handle was closed
        }
        std::remove(path.c_str());

        // Streams: consecutive pieces of at most 4096 bytes.
        for (int ex = 0; ex < 2; ++ex) {
            StreamSink sink;
            ASSERT_EQ(ex ? eko_enc_jpeg_to_stream_ex(&info, collect, &options, &sink)
                         : eko_enc_jpeg_to_stream(&info, collect, c.quality, &sink),
                      1u);
            EXPECT_EQ(sink.bytes, expected);
            for (uint32_t n : sink.pieces) EXPECT_LE(n, 4096u);
            if (expected.size() > 8192) {
                EXPECT_GE(sink.pieces.size(), expected.size() / 4096);
            }
        }
        EXPECT_EQ(live_blocks(), live_before);
    }
}

TEST(BandMode, BandsJoinToTheOneCallStream) {
    struct Case {
        uint32_t format;
        int w;
        std::vector<int> heights;
        uint32_t quality;
    };
    const Case cases[] = {
        {EKO_FORMAT_YUV420, 37, {16, 16, 13}, 75},  {EKO_FORMAT_YUV420, 64, {32, 16, 1}, 90},
        {EKO_FORMAT_GREY, 23, {8, 16, 6}, 50},      {EKO_FORMAT_GREY, 1, {40, 8, 8, 3}, 100},
        {EKO_FORMAT_RGB565, 33, {32, 3}, 80},       {EKO_FORMAT_RGB888, 17, {16, 16, 16, 16, 16, 16, 16, 16, 16, 7}, 60},
        {EKO_FORMAT_RGBA8888, 50, {48, 17}, 100},   {EKO_FORMAT_BGRA8888, 16, {16}, 30},
    };
    for (const Case& c : cases) {
        int h = 0;
        for (int b : c.heights) h += b;
        SCOPED_TRACE(describe(c.format, c.w, h, c.quality) + " in " + std::to_string(c.heights.size()) + " bands");
        const Bytes px = rgb_to_format(photo_rgb(c.w, h, 5), c.w, h, c.format);
        const Bytes whole = encode_to_memory(image_info(px.data(), c.w, h, c.format), c.quality);
        Bytes joined;
        for (const Bytes& piece : encode_bands(px, c.format, c.w, h, c.heights, c.quality)) {
            ASSERT_FALSE(piece.empty());
            joined.insert(joined.end(), piece.begin(), piece.end());
        }
        EXPECT_EQ(joined, whole);
    }
}

TEST(BandMode, EachBandStartsWithItsRestartMarkerAndOnlyTheLastEnds) {
    // 64x48 4:2:0 as three bands of 16 rows: four MCUs per row.
    const Bytes px = rgb_to_format(photo_rgb(64, 48, 9), 64, 48, EKO_FORMAT_RGB888);
    const std::vector<Bytes> bands = encode_bands(px, EKO_FORMAT_RGB888, 64, 48, {16, 16, 16}, 75);
    ASSERT_EQ(bands.size(), 3u);
    const Bytes& first = bands[0];
    ASSERT_GT(first.size(), 629u);
    EXPECT_EQ(first[163], 0x00);  // SOF0 height field: the whole image's 48 rows
    EXPECT_EQ(first[164], 48);
    for (size_t b = 0; b < 3; ++b) {
        SCOPED_TRACE(b);
        const Bytes& piece = bands[b];
        if (b > 0) {
            EXPECT_EQ(piece[0], 0xFF);
            EXPECT_EQ(piece[1], 0xD0 + (b - 1));
        }
        const bool ends = piece[piece.size() - 2] == 0xFF && piece.back() == 0xD9;
        EXPECT_EQ(ends, b == 2);
    }
}

TEST(BandMode, RefusesBandWordsThatCannotDescribeOneStream) {
    struct Case {
        const char* what;
        uint32_t format;
        int height;
        uint32_t continued, open_end;
        int total_height, top_row;
    };
    const Case cases[] = {
        {"later colour band off the MCU-row grid", EKO_FORMAT_RGB888, 16, 1, 1, 0, 8},
        {"later grey band off the MCU-row grid", EKO_FORMAT_GREY, 8, 1, 1, 0, 12},
        {"negative band top row", EKO_FORMAT_GREY, 8, 1, 0, 0, -8},
        {"first colour band of 10 rows with more to follow", EKO_FORMAT_YUV420, 10, 0, 1, 64, 0},
        {"middle grey band of 12 rows", EKO_FORMAT_GREY, 12, 1, 1, 0, 16},
        {"first band taller than the image", EKO_FORMAT_RGB888, 32, 0, 1, 16, 0},
        {"first band of a too tall image", EKO_FORMAT_GREY, 8, 0, 1, 50000, 0},
    };
    const Bytes px(image_size(EKO_FORMAT_RGB888, 32, 32), 0x80);
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        FaultScope scope;
        ImageInfo info = image_info(px.data(), 32, c.height, c.format);
        info.band_mode = 1;
        info.band_continued = c.continued;
        info.band_open_end = c.open_end;
        info.total_height = c.total_height;
        info.band_top_row = c.top_row;
        uint8_t* const block = static_cast<uint8_t*>(DORVATEKO_OsMalloc(4096));
        std::memset(block, 0xAB, 4096);
        const int64_t live = live_blocks();
        uint8_t* buffer = block;
        int32_t length = 4096;
        const EncodeOptions options{75, nullptr, 0};
        EXPECT_EQ(eko_enc_jpeg_to_buffer_ex(&info, &buffer, &length, &options), 0u);
        EXPECT_EQ(buffer, nullptr);
        EXPECT_EQ(length, 0);
        EXPECT_EQ(live_blocks(), live);  // the caller's block is still the caller's
        EXPECT_EQ(Bytes(block, block + 4096), Bytes(4096, 0xAB));
        DORVATEKO_OsFree(block);
    }
}

TEST(EntryPoints, ConcurrentEncodesMatchSequentialOnes) {
    struct Job {
        uint32_t format;
        int w, h;
        uint32_t quality;
        Bytes pixels, expected;
    };
    std::vector<Job> jobs = {{EKO_FORMAT_YUV420, 211, 97, 80, {}, {}},
                             {EKO_FORMAT_RGB565, 64, 150, 95, {}, {}},
                             {EKO_FORMAT_GREY, 300, 41, 40, {}, {}},
                             {EKO_FORMAT_RGBA8888, 77, 77, 100, {}, {}}};
    for (Job& j : jobs) {
        j.pixels = rgb_to_format(photo_rgb(j.w, j.h, j.quality), j.w, j.h, j.format);
        j.expected = encode_to_memory(image_info(j.pixels.data(), j.w, j.h, j.format), j.quality);
        ASSERT_FALSE(j.expected.empty());
    }
    std::vector<int> mismatches(jobs.size(), 0);
    std::vector<std::thread> threads;
    for (size_t t = 0; t < jobs.size(); ++t) {
        threads.emplace_back([&, t] {
            const Job& j = jobs[t];
            for (int round = 0; round < 8; ++round) {
                if (round % 2 == 0) {
                    if (encode_to_memory(image_info(j.pixels.data(), j.w, j.h, j.format), j.quality) != j.expected)
                        ++mismatches[t];
                } else {
                    StreamSink sink;
                    const ImageInfo info = image_info(j.pixels.data(), j.w, j.h, j.format);
                    if (eko_enc_jpeg_to_stream(&info, collect, j.quality, &sink) != 1 || sink.bytes != j.expected)
                        ++mismatches[t];
                }
            }
        });
    }
    for (auto& th : threads) th.join();
    for (size_t t = 0; t < jobs.size(); ++t) EXPECT_EQ(mismatches[t], 0) << "thread " << t;
}
