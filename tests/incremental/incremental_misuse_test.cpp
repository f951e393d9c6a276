// Calls the incremental interface must refuse without touching the stream,
// the sizing of the column-split buffers, and failures that must leak
// nothing and hand back no partial stream.
#include "incremental/incremental_support.h"
#include "support/fault_os_layer.h"

#include <gtest/gtest.h>

using namespace tekoj_test;

namespace {
uint32_t ignore(void*, const uint8_t*, uint32_t n) { return n; }
}  // namespace

TEST(McuRows, MisuseIsRefusedAndChangesNothing) {
    FaultScope scope;
    const int64_t live = live_blocks();
    const Bytes rgb = photo_rgb(40, 20), yuv = rgb_to_yuv420(rgb, 40, 20);
    const ImageInfo info = image_info(rgb.data(), 40, 20, EKO_FORMAT_RGB888);
    const ImageInfo planar = image_info(yuv.data(), 40, 20, EKO_FORMAT_YUV420);
    // Chroma rows that would overrun the band buffer's regions (4:4:4, chroma
    // doubled vertically) are refused at init; 4:2:2 is served.
    for (const auto& [h, v, ok] : {std::tuple{1, 1, false}, {1, 2, false}, {2, 1, true}}) {
        const EncoderSettings s = settings_420(0, 1, static_cast<uint8_t>(h), static_cast<uint8_t>(v));
        const Bytes planes(40 * 20 * 3, 0x80);  // room for any sampling's planes
        EXPECT_EQ(!encode(image_info(planes.data(), 40, 20, EKO_FORMAT_YUV420), {.settings = &s}).empty(), ok);
        EXPECT_TRUE(ok || eko_GetLastError() == EKO_ERR_SAMPLING);
    }
    // Refused calls on the way leave the stream as the plain encode makes it.
    uint32_t next = 0;
    uint8_t* buffer = nullptr;
    const Bytes whole = encode_to_memory(planar, 75);
    EXPECT_EQ(encode(planar, {.hook = [&](EncoderContext* ctx, Stage stage) {
                  if (stage == Stage::Created) {
                      EXPECT_EQ(eko_jpeg_enc_muc_process(ctx, nullptr, &next), 0u);  // the band is read
                      EXPECT_EQ(eko_jpeg_enc_muc_process(nullptr, yuv.data(), &next), 0u);
                      EXPECT_EQ(eko_jpeg_enc_muc_process(ctx, yuv.data(), nullptr), 0u);
                      EXPECT_EQ(eko_jpeg_enc_mcu__get_encdata(nullptr, &buffer, &next), nullptr);
                      EXPECT_EQ(eko_jpeg_enc_mcu__get_encdata(ctx, nullptr, &next), nullptr);
                      EXPECT_EQ(eko_jpeg_enc_mcu_set_stream(ctx, ignore, nullptr), 0u);  // not a stream
                  } else if (stage == Stage::Coded) {
                      const Bytes coded = pending(ctx);
                      next = 7;
                      EXPECT_EQ(eko_jpeg_enc_muc_process(ctx, yuv.data(), &next), 0u);  // after the last band
                      EXPECT_EQ(eko_GetLastError(), uint32_t{EKO_ERR_STATE});
                      EXPECT_TRUE(next == 7 && pending(ctx) == coded);
                  }
              }}),
              whole);

    // A stream context codes nothing before its callback is installed, and
    // keeps the first callback once bytes may have gone to it. An EXIF
    // description never reaches this interface's header.
    ExifInfo exif{};
    ImageInfo with_exif = info;
    with_exif.exif_info = &exif;
    const OutputRequest request{EKO_OUTPUT_STREAM, nullptr, nullptr, 0};
    const EncodeOptions options{75, nullptr, 0};
    EncoderContext* ctx = eko_jpeg_enc_mcu_init(&with_exif, &request, &options, nullptr);
    ASSERT_NE(ctx, nullptr);
    const Bytes header = pending(ctx);
    EXPECT_TRUE(header.size() > 4 && header[3] == 0xE0);
    EXPECT_EQ(eko_jpeg_enc_muc_process(ctx, nullptr, &next), 0u);
    EXPECT_EQ(eko_jpeg_enc_mcu_set_stream(ctx, nullptr, nullptr), 0u);
    EXPECT_EQ(pending(ctx), header);
    ASSERT_EQ(eko_jpeg_enc_mcu_set_stream(ctx, ignore, nullptr), 1u);
    EXPECT_EQ(eko_jpeg_enc_muc_process(ctx, nullptr, &next), 1u);
    EXPECT_EQ(eko_jpeg_enc_mcu_set_stream(ctx, ignore, nullptr), 0u);
    eko_jpeg_enc_mcu_finish(ctx, nullptr, nullptr);
    eko_jpeg_enc_mcu_finish(nullptr, nullptr, nullptr);
    EXPECT_EQ(live_blocks(), live);
}

TEST(RowDriver, UncodableCoefficientsAreRefusedBeforeAnyByte) {
    // Grey 24x16: two bands of three MCUs. DC values alternate +-1000, so a
    // difference of 2048 is one step too far; after a restart the predictor
    // is 0 again, so 2048 is refused there too. AC values stop at 1023.
    const ImageInfo info = image_info(nullptr, 24, 16, EKO_FORMAT_GREY);
    EncoderSettings s = settings_420(0, 1, 1, 1);
    s.num_components = 1;
    std::vector<int16_t> good(6 * 64, 0);
    for (int k = 0; k < 6; ++k) good[k * 64] = static_cast<int16_t>(k % 2 ? -1000 : 1000), good[k * 64 + 1] = -1023;
    const Bytes reference = encode(info, {.settings = &s, .mode = Mode::Rows, .coefficients = good});
    ASSERT_FALSE(reference.empty());
    struct Bad { uint32_t mcu, index; int16_t value; };
    for (const auto [mcu, index, value] : {Bad{2, 0, 1048}, Bad{1, 5, 1024}, Bad{3, 0, 2048}}) {
        for (const Mode mode : {Mode::Rows, Mode::Columns}) {
            const bool columns = mode == Mode::Columns;
            auto bad = good;
            bad[mcu * 64 + index] = value;
            // Just before the band or column holding the bad MCU is coded,
            // the bad version is handed in: refused, nothing written.
            uint32_t unit = 0, next = 0;
            const uint32_t bad_mcu = mcu;  // clang 14 cannot capture a structured binding
            auto hook = [&](EncoderContext* ctx, Stage stage) {
                if (stage != Stage::Unit || unit++ != (columns ? bad_mcu % 3 : bad_mcu / 3)) return;
                auto l = columns ? block_lists(bad, 1, bad_mcu % 3, 2, 3) : block_lists(bad, 1, bad_mcu / 3 * 3, 3, 1);
                const Bytes before = pending(ctx);
                EXPECT_EQ((columns ? __eko_jpeg_enc_col_entroy_encoder : __eko_jpeg_enc_entroy_encoder)(ctx, l.data(),
                                                                                                   &next), 0u);
                EXPECT_EQ(pending(ctx), before);
            };
            EXPECT_EQ(encode(info, {.settings = &s, .mode = mode, .coefficients = good, .hook = hook}), reference)
                << mcu;
        }
    }
}

TEST(ColumnSplit, RowBuffersAndTheSingleExactGrowthOfTheJoin) {
    const Bytes yuv = rgb_to_yuv420(photo_rgb(64, 480), 64, 480);
    const ImageInfo info = image_info(yuv.data(), 64, 480, EKO_FORMAT_YUV420);  // 30 MCU rows, 6 blocks
    for (const auto& [estimate, expected] : {std::pair{100000u, 4167u}, {0u, 4096u}, {3000u, 4096u}, {~0u, 4096u}}) {
        const EncoderSettings s = settings_420(estimate);
        const uint32_t capacity = expected;  // likewise
        uint32_t before = 0, joined = 0;
        const Bytes stream = encode(info, {.settings = &s, .mode = Mode::Columns, .hook = [&](EncoderContext* ctx, Stage st) {
            for (uint32_t r = 0; st == Stage::SetUp && r < 30; ++r) EXPECT_EQ(ctx->columns[r]->row_target->capacity, capacity);
            if (st == Stage::BeforeJoin) before = ctx->saved_output->capacity;
            if (st != Stage::Joined) return;
            // Grown once, to the joined rows plus six bytes for the end.
            EXPECT_TRUE(ctx->output->capacity > before && ctx->output->capacity == ctx->output->used + 6);
            joined = ctx->output->used;
            EXPECT_EQ(__eko_jpeg_enc_col_encoder_finish(ctx), 1u);  // a second join does nothing
        }});
        EXPECT_EQ(stream.size(), joined + 2u);
    }
}

TEST(ColumnSplit, RefusedWhereTheJoinCouldNotBeValid) {
    FaultScope scope;
    const int64_t live = live_blocks();
    const Bytes yuv = rgb_to_yuv420(photo_rgb(32, 32), 32, 32);
    const ImageInfo info = image_info(yuv.data(), 32, 32, EKO_FORMAT_YUV420);
    const EncoderSettings s = settings_420(), no_dri = settings_420(0, 0);
    auto coefficients = library_coefficients(info, &s);
    auto column = block_lists(coefficients, 6, 0, 2, 2);
    uint32_t next = 0;
    // No settings record, no DRI in the header, a band already coded: the
    // set-up is refused, the columns too, and the join has nothing to do.
    for (const EncoderSettings* settings : {static_cast<const EncoderSettings*>(nullptr), &no_dri, &s}) {
        EXPECT_FALSE(encode(info, {.settings = settings, .hook = [&](EncoderContext* ctx, Stage stage) {
                                if (stage != (settings == &s ? Stage::Coded : Stage::Created)) return;
                                EXPECT_EQ(__eko_jpeg_enc_col_encoder_init(ctx), 0u);
                                EXPECT_EQ(__eko_jpeg_enc_col_entroy_encoder(ctx, column.data(), &next), 0u);
                                EXPECT_EQ(__eko_jpeg_enc_col_encoder_finish(ctx), 1u);
                            }}).empty());
    }
    EXPECT_EQ(__eko_jpeg_enc_col_encoder_init(nullptr) + __eko_jpeg_enc_col_encoder_finish(nullptr), 0u);
    // Out of order within the mode: a second set-up, a band, a null
    // out-pointer, a join with a column missing, a column too many, a band
    // after the join. None of them changes the stream.
    const Bytes rows = encode(info, {.settings = &s, .mode = Mode::Rows});
    EXPECT_EQ(encode(info, {.settings = &s, .mode = Mode::Columns, .hook = [&](EncoderContext* ctx, Stage stage) {
                  if (stage == Stage::SetUp) {
                      EXPECT_EQ(__eko_jpeg_enc_col_encoder_init(ctx), 0u);
                      EXPECT_EQ(__eko_jpeg_enc_entroy_encoder(ctx, column.data(), &next), 0u);
                      EXPECT_EQ(__eko_jpeg_enc_col_entroy_encoder(ctx, column.data(), nullptr), 0u);
                      EXPECT_EQ(__eko_jpeg_enc_col_encoder_finish(ctx), 0u);
                  }
                  if (stage == Stage::BeforeJoin) {
                      EXPECT_EQ(__eko_jpeg_enc_col_entroy_encoder(ctx, column.data(), &next), 0u);
                  } else if (stage == Stage::Joined) {
                      EXPECT_EQ(__eko_jpeg_enc_entroy_encoder(ctx, column.data(), &next), 0u);
                  }
              }}),
              rows);
    // Finishing with the mode still set up frees the rows, hands back nothing.
    EXPECT_EQ(encode(info, {.settings = &s, .mode = Mode::Columns, .sink = Sink::File,
                            .hook = [&](EncoderContext* ctx, Stage stage) {
                                if (stage == Stage::BeforeJoin) ctx->col_next_row = 0;  // the join refuses
                            }}),
              Bytes{});
    EXPECT_EQ(live_blocks(), live);
}

TEST(IncrementalFaults, NoLeakAndNoPartialStreamAfterAnyFailure) {
    FaultScope scope;
    const Bytes yuv = rgb_to_yuv420(photo_rgb(128, 160), 128, 160);
    const ImageInfo info = image_info(yuv.data(), 128, 160, EKO_FORMAT_YUV420);
    const EncoderSettings s = settings_420(800);  // ten rows of 4096-byte buffers
    const auto coefficients = library_coefficients(info, &s);
    for (Mode mode : {Mode::Bands, Mode::Columns}) {
        const Bytes reference = encode(info, {&s, mode, Sink::Memory, coefficients});
        ASSERT_FALSE(reference.empty());
        for (int64_t n = 0;; ++n) {
            reset_counters();
            const int64_t live = live_blocks();
            fail_allocation(n);
            const Bytes got = encode(info, {&s, mode, Sink::Memory, coefficients});
            const bool injected = allocation_count() > n;
            fail_allocation(-1);
            EXPECT_EQ(live_blocks(), live) << n;
            EXPECT_TRUE(got.empty() ? injected : got == reference) << n;
            if (!injected) break;
        }
        const int64_t live = live_blocks();
        fail_writes_after(1000);  // a file that stops taking bytes
        EXPECT_EQ(encode(info, {&s, mode, Sink::File, coefficients}), Bytes{});
        fail_writes_after(-1);
        EXPECT_EQ(live_blocks(), live);
    }
    // A set-up failing part-way frees what it made and the encode can go
    // on; then the one growth of the join fails.
    for (int64_t n = 0; n < 1 + 3 * 10; ++n) {
        const int64_t live = live_blocks();
        auto hook = [&](EncoderContext* ctx, Stage stage) {
            if (stage == Stage::Created) fail_allocation(n);
            if (stage == Stage::SetUp) {
                fail_allocation(-1);
                EXPECT_TRUE(ctx->columns == nullptr && eko_GetLastError() == EKO_ERR_ALLOC);
                EXPECT_EQ(__eko_jpeg_enc_col_encoder_init(ctx), 1u);
            }
            if (stage == Stage::BeforeJoin) fail_allocation(0);
            if (stage == Stage::Joined) {
                fail_allocation(-1);
                EXPECT_TRUE(ctx->columns == nullptr && ctx->output->buffer == nullptr && pending(ctx).empty());
            }
        };
        EXPECT_EQ(encode(info, {&s, Mode::Columns, Sink::Memory, coefficients, 75, hook}), Bytes{});
        EXPECT_EQ(live_blocks(), live);
    }
}
