// Calls the incremental interface must refuse without touching the stream,
// and failures that must leak nothing and hand back no partial stream.
#include "incremental/incremental_support.h"

#include <gtest/gtest.h>

using namespace tekoj_test;

TEST(McuRows, MisuseIsRefusedAndChangesNothing) {
    NoLeak no_leak;
    // Samplings whose rows would overrun the band buffer's regions (4:4:4,
    // chroma doubled vertically) are refused at the band call, before any
    // pixel is read; the coefficient drivers still serve them, on every target.
    std::vector<int16_t> blocks(64 * 3 * 5 * 3);
    for (size_t k = 0; k < blocks.size(); ++k) blocks[k] = k % 64 < 10 ? int16_t(int(k * 37 % 101) - 50) : 0;
    for (const auto& [h, v] : {std::pair<uint8_t, uint8_t>{1, 1}, {1, 2}}) {
        SCOPED_TRACE(::testing::Message() << "luma " << int(h) << "x" << int(v));
        const EncoderSettings s = settings(0, 1, h, v);
        const Bytes band(40 * 32, 0x80), planes(40 * 20 * 3, 0x80);
        const ImageInfo info = image_info(planes.data(), 40, 20, EKO_FORMAT_YUV420);
        EXPECT_TRUE(encode(info, {.settings = &s, .hook = [&](EncoderContext* ctx, Stage stage) {
                        uint32_t next = 7;
                        const uint32_t used = ctx->output->used;
                        if (stage != Stage::Created) return;
                        EXPECT_TRUE(eko_jpeg_enc_muc_process(ctx, band.data(), &next) == 0 && next == 7 &&
                                    ctx->output->used == used && eko_GetLastError() == EKO_ERR_SAMPLING);
                    }}).empty());
        const Bytes rows = encode(info, {&s, Mode::Rows, EKO_OUTPUT_MEMORY, blocks});
        const Decoded d = decode_jpeg(rows);
        EXPECT_TRUE(d.ok && !d.warning && d.width == 40 && d.height == 20) << d.message;
        const std::vector<int16_t> back = coefficients_of(rows);
        EXPECT_TRUE(std::equal(back.begin(), back.end(), blocks.begin()));
        for (const uint32_t sink : {EKO_OUTPUT_MEMORY, EKO_OUTPUT_FILE, EKO_OUTPUT_STREAM})
            for (const Mode mode : {Mode::Rows, Mode::Columns}) EXPECT_EQ(encode(info, {&s, mode, sink, blocks}), rows);
    }
    // Refused calls leave the stream as the plain encode makes it: a missing
    // band, context or out-pointer, a callback for a memory target, a band
    // after the last.
    const Bytes yuv = rgb_to_yuv420(photo_rgb(40, 20), 40, 20);
    const ImageInfo info = image_info(yuv.data(), 40, 20, EKO_FORMAT_YUV420);
    const EkoStreamCallback ignore = [](void*, const uint8_t*, uint32_t n) { return n; };
    const uint8_t* band = yuv.data();
    McuBlockList none[3]{};
    auto hook = [&](EncoderContext* ctx, Stage stage) {
        const uint32_t used = ctx->output->used;
        uint32_t next = 7, taken = 0;
        if (stage == Stage::Coded) taken = eko_jpeg_enc_muc_process(ctx, band, &next);
        if (stage == Stage::Created)
            taken = eko_jpeg_enc_muc_process(ctx, nullptr, &next) + eko_jpeg_enc_muc_process(nullptr, band, &next) +
                    eko_jpeg_enc_muc_process(ctx, band, nullptr) + __eko_jpeg_enc_entroy_encoder(ctx, none, nullptr) +
                    __eko_jpeg_enc_entroy_encoder(nullptr, none, &next) + eko_jpeg_enc_mcu_set_stream(ctx, ignore, 0);
        EXPECT_TRUE(taken == 0 && next == 7 && ctx->output->used == used);
        EXPECT_TRUE(stage != Stage::Coded || eko_GetLastError() == EKO_ERR_STATE);
    };
    EXPECT_EQ(encode(info, {.hook = hook}), encode_to_memory(info, 75));
    // A stream target keeps its callback once a band has been handed on.
    EXPECT_EQ(encode(info, {.sink = EKO_OUTPUT_STREAM, .hook = [&](EncoderContext* ctx, Stage stage) {
                  EXPECT_TRUE(stage != Stage::Coded || (eko_jpeg_enc_mcu_set_stream(ctx, ignore, nullptr) == 0 &&
                                                        eko_GetLastError() == EKO_ERR_STATE));
              }}), encode_to_memory(info, 75));
    eko_jpeg_enc_mcu_finish(nullptr, nullptr, nullptr);
}

TEST(RowDriver, UncodableCoefficientsAreRefusedBeforeAnyByte) {
    // Grey 24x16: two bands of three MCUs. DC values alternate +-1000, so a
    // difference of 2048 is one step too far; after a restart the predictor
    // is 0 again, so 2048 is refused there too. AC values stop at 1023.
    const ImageInfo info = image_info(nullptr, 24, 16, EKO_FORMAT_GREY);
    EncoderSettings s = settings(0, 1, 1, 1);
    s.num_components = 1;
    std::vector<int16_t> good(6 * 64, 0);
    for (int k = 0; k < 6; ++k) good[k * 64] = static_cast<int16_t>(k % 2 ? -1000 : 1000), good[k * 64 + 1] = -1023;
    const Bytes reference = encode(info, {.settings = &s, .mode = Mode::Rows, .coefficients = good});
    ASSERT_FALSE(reference.empty());
    struct Bad { uint32_t mcu, index; int16_t value; };
    // MCU 4 follows MCU 3 in the second row: 1048 is refused after -1000,
    // though it would pass after the restart that MCU 3 alone follows.
    for (const Bad c : {Bad{2, 0, 1048}, {1, 5, 1024}, {3, 0, 2048}, {4, 0, 1048}}) {
        for (const bool columns : {false, true}) {
            // Just before the band or column holding the bad MCU is coded, a
            // version with the bad value is handed in: refused, nothing written.
            auto bad = good;
            bad[c.mcu * 64 + c.index] = c.value;
            uint32_t unit = 0, next = 0;
            auto hook = [&](EncoderContext* ctx, Stage stage) {
                if (stage != Stage::Unit || unit++ != (columns ? c.mcu % 3 : c.mcu / 3)) return;
                auto l = columns ? block_lists(bad, 1, c.mcu % 3, 2, 3) : block_lists(bad, 1, c.mcu / 3 * 3, 3, 1);
                const uint32_t used = ctx->output->used;
                const auto code = columns ? __eko_jpeg_enc_col_entroy_encoder : __eko_jpeg_enc_entroy_encoder;
                EXPECT_TRUE(code(ctx, l.data(), &next) == 0 && ctx->output->used == used);
            };
            const Mode mode = columns ? Mode::Columns : Mode::Rows;
            EXPECT_EQ(encode(info, {&s, mode, EKO_OUTPUT_MEMORY, good, hook}), reference) << c.mcu;
        }
    }
}

TEST(ColumnSplit, RefusedWhereTheJoinCouldNotBeValid) {
    NoLeak no_leak;
    Bytes yuv = rgb_to_yuv420(photo_rgb(32, 32), 32, 32);
    const ImageInfo info = image_info(yuv.data(), 32, 32, EKO_FORMAT_YUV420);
    const EncoderSettings s = settings(), no_dri = settings(0, 0);
    const OutputRequest memory{EKO_OUTPUT_MEMORY, nullptr, nullptr, 0};
    const EncodeOptions options{75, nullptr, 0};
    McuBlockList column[2]{};
    uint32_t next = 0;
    // No settings record, no DRI in the header, a band already coded: the
    // set-up is refused, the columns too, and the join has nothing to do.
    for (const EncoderSettings* with : {static_cast<const EncoderSettings*>(nullptr), &no_dri, &s}) {
        EXPECT_FALSE(encode(info, {.settings = with, .hook = [&](EncoderContext* ctx, Stage stage) {
                                if (stage != (with == &s ? Stage::Coded : Stage::Created)) return;
                                EXPECT_EQ(__eko_jpeg_enc_col_encoder_init(ctx) +
                                              __eko_jpeg_enc_col_entroy_encoder(ctx, column, &next), 0u);
                                EXPECT_EQ(__eko_jpeg_enc_col_encoder_finish(ctx), 1u);
                            }}).empty());
    }
    // A column after the last one is refused; finishing with the columns not
    // joined frees the rows and hands back no stream.
    std::vector<int16_t> zero(2 * 6 * 64, 0);
    auto lists = block_lists(zero, 6, 0, 2, 1);
    EncoderContext* ctx = eko_jpeg_enc_mcu_init(&info, &memory, &options, &s);
    ASSERT_TRUE(ctx != nullptr && __eko_jpeg_enc_col_encoder_init(ctx) == 1);
    // A join before the last column is refused too.
    for (int k = 0; k < 3; ++k) {
        EXPECT_EQ(__eko_jpeg_enc_col_entroy_encoder(ctx, lists.data(), &next), k < 2 ? 1u : 0u);
        EXPECT_TRUE(k > 0 || (__eko_jpeg_enc_col_encoder_finish(ctx) == 0 && eko_GetLastError() == EKO_ERR_STATE));
    }
    EXPECT_TRUE(next == 32 && eko_GetLastError() == EKO_ERR_STATE);
    uint8_t* block = yuv.data();
    uint32_t length = 7;
    eko_jpeg_enc_mcu_finish(ctx, &block, &length);
    EXPECT_TRUE(block == nullptr && length == 0 && eko_GetLastError() == EKO_ERR_STATE);
    EXPECT_EQ(__eko_jpeg_enc_col_encoder_init(nullptr) + __eko_jpeg_enc_col_encoder_finish(nullptr), 0u);
}

TEST(IncrementalFaults, AColumnSetUpThatFailsPartWayCanBeRetriedAndAFailedJoinHandsBackNothing) {
    const Bytes yuv = rgb_to_yuv420(photo_rgb(128, 160), 128, 160);
    const ImageInfo info = image_info(yuv.data(), 128, 160, EKO_FORMAT_YUV420);
    const EncoderSettings s = settings(800);  // ten rows of 4096-byte buffers
    const auto coefficients = coefficients_of(encode(info, {.settings = &s}));
    // A set-up failing part-way frees what it made and the encode can go
    // on; then the one growth of the join fails.
    for (int64_t n = 0; n < 1 + 3 * 10; ++n) {
        NoLeak no_leak;
        auto hook = [&](EncoderContext* ctx, Stage stage) {
            fail_allocation(stage == Stage::Created ? n : stage == Stage::BeforeJoin ? 0 : -1);
            EXPECT_TRUE(stage != Stage::SetUp || (ctx->columns == nullptr && eko_GetLastError() == EKO_ERR_ALLOC &&
                                                  __eko_jpeg_enc_col_encoder_init(ctx) == 1)) << n;
            EXPECT_TRUE(stage != Stage::Joined || (ctx->columns == nullptr && ctx->output->buffer == nullptr)) << n;
        };
        EXPECT_EQ(encode(info, {&s, Mode::Columns, EKO_OUTPUT_MEMORY, coefficients, hook}), Bytes{});
    }
}
