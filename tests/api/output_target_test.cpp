// Output target: grow-by-copy, and memory targets that never write past their
// capacity and grow geometrically.
#include <TekoJEncoder.h>

#include "support/fault_os_layer.h"
#include "support/test_support.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <string>
#include <vector>

using namespace tekoj_test;

namespace {

constexpr uint32_t kFormats[] = {EKO_FORMAT_RGB565, EKO_FORMAT_RGB888,   EKO_FORMAT_YUV420,
                                 EKO_FORMAT_GREY,   EKO_FORMAT_RGBA8888, EKO_FORMAT_BGRA8888};

Bytes noise(size_t n, uint32_t seed) {
    Bytes b(n);
    for (auto& v : b) v = static_cast<uint8_t>((seed = seed * 1664525u + 1013904223u) >> 24);
    return b;
}

uint32_t append(void* arg, const uint8_t* data, uint32_t count) {
    static_cast<Bytes*>(arg)->insert(static_cast<Bytes*>(arg)->end(), data, data + count);
    return count;
}

// A memory-target context on a block of exactly `capacity` bytes (none for 0).
EncoderContext* memory_context(const ImageInfo& info, uint32_t capacity, uint32_t quality) {
    uint8_t* block = capacity ? static_cast<uint8_t*>(DORVATEKO_OsMalloc(capacity)) : nullptr;
    const OutputRequest request{EKO_OUTPUT_MEMORY, nullptr, block, capacity};
    const EncodeOptions options{quality, nullptr, 0};
    EncoderContext* ctx = __eko_jpeg_enc_initiaize(&info, &request, &options, nullptr);
    EXPECT_NE(ctx, nullptr);
    return ctx;
}

// Codes every band, calling `after_band` after each, completes the stream and
// frees everything; returns the stream.
template <typename AfterBand>
Bytes finish(EncoderContext* ctx, AfterBand after_band) {
    while (ctx->next_row < static_cast<uint32_t>(ctx->height)) {
        EXPECT_EQ(__eko_jpeg_enc_process_image_data(ctx), 1u);
        ctx->next_row = static_cast<uint16_t>(ctx->next_row + ctx->max_v_samp * 8);
        after_band(ctx->output);
    }
    EXPECT_EQ(__eko_jpeg_enc_make_end_mark(ctx), 1u);
    EXPECT_LE(ctx->output->used, ctx->output->capacity);
    Bytes out(ctx->output->buffer, ctx->output->buffer + ctx->output->total);
    DORVATEKO_OsFree(ctx->output->buffer);
    __eko_jpeg_enc_release_mem(ctx);
    DORVATEKO_OsFree(ctx);
    return out;
}

}  // namespace

TEST(OutputTarget, ReallocCopiesAndAlwaysFreesTheOldBlock) {
    FaultScope scope;
    const int64_t live = live_blocks();
    EXPECT_EQ(eko_jpeg_enc_realloc(nullptr, 100, 10), nullptr);
    EXPECT_EQ(allocation_count(), 0);

    uint8_t* old_block = static_cast<uint8_t*>(DORVATEKO_OsMalloc(100));
    for (int i = 0; i < 100; ++i) old_block[i] = static_cast<uint8_t>(i * 7);
    uint8_t* grown = eko_jpeg_enc_realloc(old_block, 100, 50);
    ASSERT_NE(grown, nullptr);
    for (int i = 0; i < 100; ++i) ASSERT_EQ(grown[i], static_cast<uint8_t>(i * 7));
    grown[149] = 1;  // the new block has old + extra bytes
    EXPECT_EQ(live_blocks(), live + 1);

    fail_allocation(0);
    eko_SetError(EKO_OK);
    EXPECT_EQ(eko_jpeg_enc_realloc(grown, 150, 4096), nullptr);
    EXPECT_EQ(eko_GetLastError(), static_cast<uint32_t>(EKO_ERR_ALLOC));
    EXPECT_EQ(live_blocks(), live);
}

TEST(MemoryTarget, NoisyImagesNeverOverflowAnyTarget) {
    // Noise at quality 100 is the densest the coder can be given; a 2048-byte
    // block starts below even one worst-case MCU. The sanitizer build turns
    // any write past a block into a failure.
    const int sizes[][2] = {{8, 8}, {16, 16}, {33, 17}, {200, 100}, {1, 600}, {640, 16}};
    const std::string path = temp_path("noise.jpg");
    for (const auto& s : sizes) {
        for (uint32_t format : kFormats) {
            SCOPED_TRACE("format " + std::to_string(format) + " " + std::to_string(s[0]) + "x" + std::to_string(s[1]));
            const Bytes px = noise(image_size(format, s[0], s[1]), s[0] * 131u + format);
            const ImageInfo info = image_info(px.data(), s[0], s[1], format);
            const EncodeOptions options{100, nullptr, 0};
            uint8_t* buffer = static_cast<uint8_t*>(DORVATEKO_OsMalloc(2048));
            int32_t length = 2048;
            ASSERT_EQ(eko_enc_jpeg_to_buffer_ex(&info, &buffer, &length, &options), 1u);
            const Bytes memory(buffer, buffer + length);
            DORVATEKO_OsFree(buffer);
            Bytes streamed;
            ASSERT_EQ(eko_enc_jpeg_to_stream_ex(&info, append, &options, &streamed), 1u);
            EXPECT_EQ(streamed, memory);
            ASSERT_EQ(eko_enc_jpeg_to_file_ex(&info, path.c_str(), &options), 1u);
            EXPECT_EQ(read_file(path), memory);
            const Decoded d = decode_jpeg(memory);
            EXPECT_TRUE(d.ok && !d.warning) << d.message;
        }
    }
    std::remove(path.c_str());
}

TEST(MemoryTarget, GrowsGeometricallyKeepingTheBytesWritten) {
    // One MCU per band, so that every growth is seen.
    const Bytes px = noise(image_size(EKO_FORMAT_YUV420, 16, 512), 21);
    const ImageInfo info = image_info(px.data(), 16, 512, EKO_FORMAT_YUV420);
    EncoderContext* ctx = memory_context(info, 2048, 100);
    ASSERT_NE(ctx, nullptr);
    ASSERT_EQ(__eko_jpeg_enc_make_header(ctx), 1u);
    ASSERT_EQ(ctx->output->capacity, 2048u);
    const Bytes header(ctx->output->buffer, ctx->output->buffer + ctx->output->used);
    std::vector<uint32_t> capacities{2048};
    const Bytes stream = finish(ctx, [&](const OutputTarget* t) {
        EXPECT_LE(t->used, t->capacity);
        EXPECT_LE(t->total, t->used);
        EXPECT_TRUE(std::equal(header.begin(), header.end(), t->buffer));
        if (t->capacity != capacities.back()) capacities.push_back(t->capacity);
    });
    ASSERT_GE(capacities.size(), 5u);
    EXPECT_EQ(capacities[1], 6144u);  // the first growth adds 4096
    for (size_t i = 1; i < capacities.size(); ++i) {
        SCOPED_TRACE(i);
        EXPECT_GE(capacities[i], capacities[i - 1] + std::max(4096u, capacities[i - 1] / 2));
    }
    EXPECT_EQ(stream, encode_to_memory(info, 100));
}

TEST(MemoryTarget, LargeImagesGrowInAFewSteps) {
    // About 1.3 MB of stream: steps of a fixed size would take hundreds of
    // growths, each copying the stream so far.
    const Bytes px = noise(image_size(EKO_FORMAT_RGB888, 1024, 640), 8);
    const ImageInfo info = image_info(px.data(), 1024, 640, EKO_FORMAT_RGB888);
    const EncodeOptions options{100, nullptr, 0};
    FaultScope scope;
    uint8_t* buffer = static_cast<uint8_t*>(DORVATEKO_OsMalloc(64 << 20));
    int32_t length = 64 << 20;
    reset_counters();
    ASSERT_EQ(eko_enc_jpeg_to_buffer_ex(&info, &buffer, &length, &options), 1u);
    const int64_t without_growth = allocation_count();
    const Bytes expected(buffer, buffer + length);
    DORVATEKO_OsFree(buffer);
    ASSERT_GT(expected.size(), 1u << 20);

    buffer = static_cast<uint8_t*>(DORVATEKO_OsMalloc(2048));
    length = 2048;
    reset_counters();
    ASSERT_EQ(eko_enc_jpeg_to_buffer_ex(&info, &buffer, &length, &options), 1u);
    const int64_t growths = allocation_count() - without_growth;
    EXPECT_EQ(Bytes(buffer, buffer + length), expected);
    DORVATEKO_OsFree(buffer);
    EXPECT_GT(growths, 0);
    EXPECT_LE(growths, 25);
}
