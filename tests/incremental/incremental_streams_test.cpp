// Every incremental way of coding an image gives the whole-image stream, byte
// for byte, and the golden cases.
#include "incremental/incremental_support.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>

using namespace tekoj_test;

const uint32_t kSinks[] = {EKO_OUTPUT_MEMORY, EKO_OUTPUT_FILE, EKO_OUTPUT_STREAM};

TEST(McuRows, BandsAndRowDriverGiveTheWholeImageStream) {
    struct Case { uint32_t format; int width, height; };
    for (const Case c : {Case{2, 37, 21}, {2, 101, 100}, {4, 33, 17}, {4, 17, 100}, {0, 1, 7}, {1, 50, 33},
                         {7, 7, 5}, {8, 31, 9}}) {
        SCOPED_TRACE(::testing::Message() << c.format << ": " << c.width << "x" << c.height);
        const Bytes pixels = rgb_to_format(photo_rgb(c.width, c.height, 7), c.width, c.height, c.format);
        const ImageInfo info = image_info(pixels.data(), c.width, c.height, c.format);
        const Bytes whole = encode_to_memory(info, 75);
        const Decoded d = decode_jpeg(whole);
        EXPECT_TRUE(d.ok && !d.warning) << d.message;
        for (const uint32_t sink : kSinks) EXPECT_EQ(encode(info, {.sink = sink}), whole);
        // What a memory target holds so far is always a prefix of the stream:
        // the header alone right after init.
        const uint8_t sos_marker[2] = {0xFF, 0xDA};
        const size_t sos = size_t(std::search(whole.begin(), whole.end(), sos_marker, sos_marker + 2) - whole.begin());
        const size_t header = sos + 2 + (whole[sos + 2] << 8 | whole[sos + 3]);
        size_t seen = 0;
        EXPECT_EQ(encode(info, {.hook = [&](EncoderContext* ctx, Stage stage) {
                      uint8_t* buffer = nullptr;
                      uint32_t length = 0;
                      const uint8_t* r = eko_jpeg_enc_mcu__get_encdata(ctx, &buffer, &length);
                      EXPECT_TRUE(r == buffer && length >= seen && length < whole.size() &&
                                  std::equal(buffer, buffer + length, whole.begin()));
                      EXPECT_TRUE(stage != Stage::Created || length == header);
                      seen = length;
                  }}), whole);
        // Coefficients read back from the stream are the library's own.
        EXPECT_EQ(encode(info, {.mode = Mode::Rows}), whole);
    }
}

TEST(ColumnSplit, JoinGivesTheRowDriverStreamForEveryTarget) {
    // One MCU row, ten MCU rows (RST0..RST7, RST0), odd sizes, rows longer
    // than a stream piece. Row buffers start at the estimate's share of a row
    // plus a quarter, or 4096 bytes when that is small or the estimate is 0
    // or absurd, and grow when a row needs more.
    struct Case { int width, height, markers; uint32_t estimate, capacity; };
    for (const Case c : {Case{40, 16, 0, 0, 4096}, {24, 160, 9, ~0u, 4096}, {37, 21, 1, 3000, 1875},
                         {17, 130, 8, 1000, 4096}, {4000, 24, 1, 1000, 4096}, {64, 480, 29, 100000, 4167}}) {
        SCOPED_TRACE(::testing::Message() << c.width << "x" << c.height);
        const Bytes yuv = rgb_to_yuv420(photo_rgb(c.width, c.height, 5), c.width, c.height);
        const ImageInfo info = image_info(yuv.data(), c.width, c.height, EKO_FORMAT_YUV420);
        const EncoderSettings s = settings(c.estimate);
        const Bytes rows = encode(info, {.settings = &s, .mode = Mode::Rows});
        EXPECT_EQ(encode(info, {.settings = &s}), rows);
        for (const uint32_t sink : kSinks) {
            uint32_t before = 0, next = 0;
            const auto hook = [&](EncoderContext* ctx, Stage st) {
                if (st == Stage::SetUp) {
                    for (uint32_t r = 0; r < ctx->total_imcu_rows; ++r)
                        EXPECT_EQ(ctx->columns[r]->row_target->capacity, c.capacity);
                    // A second set-up, a null out-pointer and a band are
                    // refused and change nothing.
                    McuBlockList none[512]{};  // room for a row
                    EXPECT_EQ(__eko_jpeg_enc_col_encoder_init(ctx) + __eko_jpeg_enc_entroy_encoder(ctx, none, &next) +
                                  __eko_jpeg_enc_col_entroy_encoder(ctx, none, nullptr), 0u);
                }
                if (st == Stage::BeforeJoin) before = ctx->saved_output->capacity;
                // A memory target grows at most once, to the joined rows plus
                // six bytes for the end; a second join does nothing.
                EXPECT_TRUE(st != Stage::Joined || sink != EKO_OUTPUT_MEMORY ||
                            ((ctx->output->capacity == before || ctx->output->capacity == ctx->output->used + 6) &&
                             __eko_jpeg_enc_col_encoder_finish(ctx) == 1));
            };
            EXPECT_EQ(encode(info, {.settings = &s, .mode = Mode::Columns, .sink = sink, .hook = hook}), rows);
        }
        int markers = 0;  // RST0..RST7, RST0, ... in order
        for (size_t i = 0; i + 1 < rows.size(); ++i) markers += rows[i] == 0xFF && rows[i + 1] == 0xD0 + markers % 8;
        EXPECT_EQ(markers, c.markers);
        const Decoded d = decode_jpeg(rows);
        EXPECT_TRUE(d.ok && !d.warning) << d.message;
    }
}

TEST(IncrementalGolden, McuRowsAndCoefficientCasesMatch) {
    const EncoderSettings s422 = settings(0, 1, 2, 1, 70), s420 = settings(5000, 1, 2, 2, 60);
    Bytes input = read_file(golden_path("mcurows-yuv422-37x21-q70.in"));
    EXPECT_EQ(encode(image_info(input.data(), 37, 21, EKO_FORMAT_YUV420), {.settings = &s422}),
              read_file(golden_path("mcurows-yuv422-37x21-q70.expected")));
    input = read_file(golden_path("colsplit-yuv420-40x36-q60.in"));
    std::vector<int16_t> coefficients(input.size() / 2);  // little-endian, as the host
    std::memcpy(coefficients.data(), input.data(), input.size());
    const Bytes expected = read_file(golden_path("colsplit-yuv420-40x36-q60.expected"));
    const ImageInfo info = image_info(nullptr, 40, 36, EKO_FORMAT_YUV420);
    for (const Mode mode : {Mode::Rows, Mode::Columns})
        for (const uint32_t sink : kSinks) EXPECT_EQ(encode(info, {&s420, mode, sink, coefficients}), expected);
}
