// Whole-image entry points: streams decode cleanly for every format, size and
// quality; every output kind yields the same bytes; bands coded by separate
// calls join to the one-call stream; concurrent calls do not interfere;
// memory targets grow by 4096 bytes, then geometrically, keeping the bytes
// written and never writing past their capacity.
#include <TekoJEncoderInternal.h>

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
    // Small sizes are all covered below; here the extremes and the PSNR floors.
    const int sizes[][2] = {{1, 49999}, {49999, 1}, {128, 96}};
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

TEST(EntryPoints, EverySmallSizeFormatQualityAndOutputKindDecodesCleanlyAndAgrees) {
    // Every width and height 1..48: partial blocks, partial MCUs and last
    // bands of every height. Tiles of saturated blue beside saturated yellow
    // put chroma DC differences in the largest category (11); tiles of noise
    // at quality 100 are the densest data the coder can be given, so memory
    // targets grow from short blocks (the sanitizer build turns a write past
    // a block into a failure). The coarsest and finest tables (every
    // quality's tables are pinned by the header test). The memory stream is
    // the reference; the other members take turns.
    const std::string path = temp_path("small.jpg");
    int turn = 0;
    for (int w = 1; w <= 48; ++w)
        for (int h = 1; h <= 48; ++h) {
            Bytes rgb = noise(size_t(w) * h * 3, uint32_t(w * 64 + h));
            for (int y = 0; y < h; ++y)
                for (int x = 0; x < w; ++x) {
                    const int tile = (x / 16 + y / 16) % 3;
                    if (tile < 2) std::copy_n(tile == 0 ? "\0\0\xFF" : "\xFF\xFF\0", 3, &rgb[(size_t(y) * w + x) * 3]);
                }
            for (uint32_t format : kFormats) {
                const Bytes px = rgb_to_format(rgb, w, h, format);
                const ImageInfo info = image_info(px.data(), w, h, format);
                for (uint32_t q : {1u, 100u}) {
                    const Bytes memory = encode_to_memory(info, q);
                    const Decoded d = decode_jpeg(memory);
                    ASSERT_TRUE(d.ok && !d.warning && d.width == w && d.height == h) << describe(format, w, h, q) << d.message;
                    const int m = turn++ % kMembers;
                    const Call c = call_member(m, info, q, path, m == kToBuffer ? 100 : 0);
                    ASSERT_TRUE(c.result == 1 && c.out == memory && c.largest_piece <= 4096)
                        << describe(format, w, h, q) << " " << member_name(m);
                }
            }
        }
    std::remove(path.c_str());
}

TEST(Threads, ManyEncodersAtOnceOnEveryOutputKindMatchASequentialRun) {
    // One EXIF description with the date stamp and an APP1 segment that
    // leaves a file or stream target's work buffer too little room for the
    // rest of the header, were it not made.
    ExifInfo exif{};
    const std::string make(3580, 'M');
    exif.make = make.c_str(), exif.stamp_date_time = 1;
    struct Job { uint32_t format; int w, h; uint32_t quality; const ExifInfo* exif; Bytes pixels, expected; };
    std::vector<Job> jobs = {{EKO_FORMAT_YUV420, 300, 200, 90, nullptr, {}, {}}, {EKO_FORMAT_RGB565, 33, 17, 75, &exif, {}, {}},
                             {EKO_FORMAT_GREY, 1, 3001, 100, nullptr, {}, {}},   {EKO_FORMAT_RGBA8888, 77, 77, 40, &exif, {}, {}},
                             {EKO_FORMAT_BGRA8888, 64, 48, 1, &exif, {}, {}},   {EKO_FORMAT_RGB888, 100, 75, 60, nullptr, {}, {}}};
    for (Job& j : jobs) {
        j.pixels = rgb_to_format(photo_rgb(j.w, j.h, 11), j.w, j.h, j.format);
        ImageInfo info = image_info(j.pixels.data(), j.w, j.h, j.format);
        info.exif_info = j.exif;
        j.expected = without_date(call_member(kToBufferEx, info, j.quality, "").out);
    }
    const int64_t live_before = live_blocks();
    std::vector<std::thread> threads;
    for (int t = 0; t < 12; ++t) threads.emplace_back([&jobs, t] {
        const Job& j = jobs[size_t(t) % jobs.size()];
        ImageInfo info = image_info(j.pixels.data(), j.w, j.h, j.format);
        info.exif_info = j.exif;
        const std::string path = temp_path("threads" + std::to_string(t) + ".jpg");
        // Memory members from no block, a short one and a roomy one; files by
        // name and by handle; streams in pieces of at most 4096 bytes.
        for (int m = 0; m < kMembers; ++m)
            for (int32_t start : {0, 100, 1 << 20}) {
                if (start != 0 && !is_memory_member(m)) continue;
                const Call c = call_member(m, info, j.quality, path, start);
                EXPECT_TRUE(c.result == 1 && without_date(c.out) == j.expected && c.largest_piece <= 4096)
                    << member_name(m) << " " << start << " job " << t;
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
        {"first band announcing 50000 rows", EKO_FORMAT_RGB888, 16, 0, 1, 50000, 0},
        {"later band at row 0", EKO_FORMAT_GREY, 8, 1, 0, 0, 0},
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

TEST(MemoryTarget, GrowsBy4096ThenGeometricallyKeepingTheBytesWritten) {
    // One MCU per band, so that every growth is seen.
    const Bytes px = noise(image_size(EKO_FORMAT_YUV420, 16, 512), 21);
    const ImageInfo info = image_info(px.data(), 16, 512, EKO_FORMAT_YUV420);
    Context c(info, nullptr, 100);
    EncoderContext* const ctx = c.ctx;
    ASSERT_NE(ctx, nullptr);
    ASSERT_EQ(__eko_jpeg_enc_make_header(ctx), 1u);
    const OutputTarget* t = ctx->output;
    const Bytes header(t->buffer, t->buffer + t->used);
    std::vector<uint32_t> capacities{t->capacity};
    for (; ctx->next_row < 512; ctx->next_row = static_cast<uint16_t>(ctx->next_row + 16)) {
        EXPECT_EQ(__eko_jpeg_enc_process_image_data(ctx), 1u);
        EXPECT_TRUE(t->total <= t->used && t->used <= t->capacity);
        EXPECT_TRUE(std::equal(header.begin(), header.end(), t->buffer));
        if (t->capacity != capacities.back()) capacities.push_back(t->capacity);
    }
    EXPECT_EQ(__eko_jpeg_enc_make_end_mark(ctx), 1u);
    EXPECT_EQ(Bytes(t->buffer, t->buffer + t->total), encode_to_memory(info, 100));
    // Completion makes its own room for the pad byte, its stuffing and EOI,
    // whatever room the coding left.
    const Bytes small = noise(image_size(EKO_FORMAT_GREY, 8, 8), 5);
    const ImageInfo tiny = image_info(small.data(), 8, 8, EKO_FORMAT_GREY);
    for (uint32_t room = 0; room <= 12; ++room) {
        Context e(tiny, nullptr, 100);
        ASSERT_TRUE(e.ctx != nullptr && __eko_jpeg_enc_make_header(e.ctx) == 1 && __eko_jpeg_enc_process_image_data(e.ctx) == 1);
        e->output->capacity = e->output->used + room;  // the block is larger; only the bookkeeping says less
        EXPECT_TRUE(__eko_jpeg_enc_make_end_mark(e.ctx) == 1 && e->output->used <= e->output->capacity) << room;
        EXPECT_EQ(Bytes(e->output->buffer, e->output->buffer + e->output->total), encode_to_memory(tiny, 100)) << room;
    }
    ASSERT_GE(capacities.size(), 5u);
    EXPECT_TRUE(capacities[0] == 2048 && capacities[1] == 6144);  // the first growth adds 4096
    for (size_t i = 1; i < capacities.size(); ++i)
        EXPECT_GE(capacities[i], capacities[i - 1] + std::max(4096u, capacities[i - 1] / 2)) << i;
}
