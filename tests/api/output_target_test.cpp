// Output targets never write past their capacity; memory targets grow by
// 4096 bytes, then geometrically, keeping the bytes written.
#include <TekoJEncoderInternal.h>

#include "support/test_support.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <string>
#include <vector>

using namespace tekoj_test;

namespace {

uint32_t append(void* arg, const uint8_t* data, uint32_t count) {
    static_cast<Bytes*>(arg)->insert(static_cast<Bytes*>(arg)->end(), data, data + count);
    return count;
}

}  // namespace

TEST(MemoryTarget, NoisyImagesNeverOverflowAnyTarget) {
    // Noise at quality 100 is the densest the coder can be given; a 2048-byte
    // block starts below even one worst-case MCU. The sanitizer build turns
    // any write past a block into a failure.
    const int sizes[][2] = {{8, 8}, {33, 17}, {200, 100}, {1, 600}, {640, 16}};
    const std::string path = temp_path("noise.jpg");
    const EncodeOptions options{100, nullptr, 0};
    for (const auto& s : sizes) {
        for (uint32_t format : {EKO_FORMAT_RGB565, EKO_FORMAT_RGB888, EKO_FORMAT_YUV420, EKO_FORMAT_GREY,
                                EKO_FORMAT_RGBA8888, EKO_FORMAT_BGRA8888}) {
            SCOPED_TRACE("format " + std::to_string(format) + " " + std::to_string(s[0]) + "x" + std::to_string(s[1]));
            const Bytes px = noise(image_size(format, s[0], s[1]), s[0] * 131u + format);
            const ImageInfo info = image_info(px.data(), s[0], s[1], format);
            uint8_t* buffer = static_cast<uint8_t*>(DORVATEKO_OsMalloc(2048));
            int32_t length = 2048;
            ASSERT_EQ(eko_enc_jpeg_to_buffer_ex(&info, &buffer, &length, &options), 1u);
            const Bytes memory(buffer, buffer + length);
            DORVATEKO_OsFree(buffer);
            Bytes streamed;
            ASSERT_EQ(eko_enc_jpeg_to_stream_ex(&info, append, &options, &streamed), 1u);
            ASSERT_EQ(eko_enc_jpeg_to_file_ex(&info, path.c_str(), &options), 1u);
            EXPECT_TRUE(streamed == memory && read_file(path) == memory);
            const Decoded d = decode_jpeg(memory);
            EXPECT_TRUE(d.ok && !d.warning) << d.message;
        }
    }
    std::remove(path.c_str());
}

TEST(MemoryTarget, GrowsBy4096ThenGeometricallyKeepingTheBytesWritten) {
    // One MCU per band, so that every growth is seen.
    const Bytes px = noise(image_size(EKO_FORMAT_YUV420, 16, 512), 21);
    const ImageInfo info = image_info(px.data(), 16, 512, EKO_FORMAT_YUV420);
    const OutputRequest request{EKO_OUTPUT_MEMORY, nullptr, static_cast<uint8_t*>(DORVATEKO_OsMalloc(2048)), 2048};
    const EncodeOptions options{100, nullptr, 0};
    EncoderContext* ctx = __eko_jpeg_enc_initiaize(&info, &request, &options, nullptr);
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
    DORVATEKO_OsFree(t->buffer);
    __eko_jpeg_enc_release_mem(ctx);
    DORVATEKO_OsFree(ctx);
    // Completion makes its own room for the pad byte, its stuffing and EOI,
    // whatever room the coding left.
    const Bytes small = noise(image_size(EKO_FORMAT_GREY, 8, 8), 5);
    const ImageInfo tiny = image_info(small.data(), 8, 8, EKO_FORMAT_GREY);
    for (uint32_t room = 0; room <= 12; ++room) {
        const OutputRequest none{EKO_OUTPUT_MEMORY, nullptr, nullptr, 0};
        EncoderContext* c = __eko_jpeg_enc_initiaize(&tiny, &none, &options, nullptr);
        ASSERT_TRUE(c != nullptr && __eko_jpeg_enc_make_header(c) == 1 && __eko_jpeg_enc_process_image_data(c) == 1);
        c->output->capacity = c->output->used + room;  // the block is larger; only the bookkeeping says less
        EXPECT_TRUE(__eko_jpeg_enc_make_end_mark(c) == 1 && c->output->used <= c->output->capacity) << room;
        EXPECT_EQ(Bytes(c->output->buffer, c->output->buffer + c->output->total), encode_to_memory(tiny, 100)) << room;
        DORVATEKO_OsFree(c->output->buffer);
        __eko_jpeg_enc_release_mem(c);
        DORVATEKO_OsFree(c);
    }
    ASSERT_GE(capacities.size(), 5u);
    EXPECT_TRUE(capacities[0] == 2048 && capacities[1] == 6144);  // the first growth adds 4096
    for (size_t i = 1; i < capacities.size(); ++i)
        EXPECT_GE(capacities[i], capacities[i - 1] + std::max(4096u, capacities[i - 1] / 2)) << i;
}
