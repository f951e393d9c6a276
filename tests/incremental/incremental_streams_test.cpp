// Every incremental way of coding an image gives the whole-image stream, byte
// for byte, and the golden cases.
#include "incremental/incremental_support.h"

#include <gtest/gtest.h>

using namespace tekoj_test;

namespace {
std::vector<int> restart_markers(const Bytes& jpeg) {
    std::vector<int> out;
    for (size_t i = 0; i + 1 < jpeg.size(); ++i)
        if (jpeg[i] == 0xFF && (jpeg[i + 1] & 0xF8) == 0xD0) out.push_back(jpeg[i + 1] - 0xD0);
    return out;
}
}  // namespace

TEST(McuRows, BandsAndLibraryCoefficientsGiveTheWholeImageStream) {
    struct Case { uint32_t format; int width, height; };
    for (const Case c : {Case{2, 37, 21}, Case{2, 101, 100}, Case{4, 33, 17}, Case{4, 17, 100}, Case{0, 1, 7},
                         Case{1, 50, 33}, Case{7, 7, 5}, Case{8, 31, 9}}) {
        SCOPED_TRACE(::testing::Message() << c.format << ": " << c.width << "x" << c.height);
        const Bytes pixels = rgb_to_format(photo_rgb(c.width, c.height, 7), c.width, c.height, c.format);
        const ImageInfo info = image_info(pixels.data(), c.width, c.height, c.format);
        const Bytes whole = encode_to_memory(info, 75);
        ASSERT_FALSE(whole.empty());
        EXPECT_EQ(encode(info, {}), whole);
        EXPECT_EQ(encode(info, {.mode = Mode::Rows}), whole);
        if (c.format == EKO_FORMAT_YUV420 || c.format == EKO_FORMAT_RGB888) {
            EXPECT_EQ(encode(info, {.sink = Sink::File}), whole);
            EXPECT_EQ(encode(info, {.sink = Sink::Stream}), whole);
        }
        const Decoded d = decode_jpeg(whole);
        EXPECT_TRUE(d.ok && !d.warning) << d.message;
    }
}

TEST(ColumnSplit, JoinGivesTheRowByRowStreamForEveryTarget) {
    struct Case { int width, height; size_t markers; };
    // One MCU row, ten MCU rows, odd sizes, rows longer than a stream piece;
    // a small estimate makes the row buffers grow.
    for (const Case c : {Case{40, 16, 0}, Case{24, 160, 9}, Case{37, 21, 1}, Case{17, 130, 8}, Case{4000, 24, 1}}) {
        SCOPED_TRACE(::testing::Message() << c.width << "x" << c.height);
        const Bytes yuv = rgb_to_yuv420(photo_rgb(c.width, c.height, 5), c.width, c.height);
        const ImageInfo info = image_info(yuv.data(), c.width, c.height, EKO_FORMAT_YUV420);
        const EncoderSettings s = settings_420(1000);
        const Bytes rows = encode(info, {.settings = &s, .mode = Mode::Rows});
        EXPECT_EQ(encode(info, {.settings = &s}), rows);
        for (Sink sink : {Sink::Memory, Sink::File, Sink::Stream})
            EXPECT_EQ(encode(info, {.settings = &s, .mode = Mode::Columns, .sink = sink}), rows);
        std::vector<int> expected(c.markers);
        for (size_t i = 0; i < expected.size(); ++i) expected[i] = static_cast<int>(i % 8);
        EXPECT_EQ(restart_markers(rows), expected);
        const Decoded d = decode_jpeg(rows);
        EXPECT_TRUE(d.ok && !d.warning) << d.message;
    }
}

TEST(IncrementalGolden, McuRowsAndCoefficientCasesMatch) {
    int w = 0, h = 0;
    uint32_t quality = 0;
    EncoderSettings s = golden_settings("mcurows-yuv422-37x21-q70", w, h, quality);
    Bytes input = read_file(golden_path("mcurows-yuv422-37x21-q70.in"));
    ASSERT_EQ(input.size(), static_cast<size_t>(w * h + 2 * ((w + 1) / 2) * h));  // 4:2:2 planes
    EXPECT_EQ(encode(image_info(input.data(), w, h, 2), {.settings = &s, .quality = quality}),
              read_file(golden_path("mcurows-yuv422-37x21-q70.expected")));

    s = golden_settings("colsplit-yuv420-40x36-q60", w, h, quality);
    input = read_file(golden_path("colsplit-yuv420-40x36-q60.in"));
    const Bytes expected = read_file(golden_path("colsplit-yuv420-40x36-q60.expected"));
    std::vector<int16_t> coefficients(input.size() / 2);
    for (size_t i = 0; i < coefficients.size(); ++i)
        coefficients[i] = static_cast<int16_t>(input[2 * i] | input[2 * i + 1] << 8);
    const ImageInfo info = image_info(nullptr, w, h, EKO_FORMAT_YUV420);
    EXPECT_EQ(encode(info, {.settings = &s, .mode = Mode::Rows, .coefficients = coefficients, .quality = quality}),
              expected);
    for (Sink sink : {Sink::Memory, Sink::File, Sink::Stream})
        EXPECT_EQ(encode(info, {&s, Mode::Columns, sink, coefficients, quality}), expected);
}
