// Column-split mode: the joined stream against the row driver's for every
// main target, row buffer sizing, the exact growth of the join, refusals,
// and clean failure at every allocation of an incremental encode.
#include "incremental/incremental_support.h"
#include "support/fault_os_layer.h"

#include <gtest/gtest.h>

using namespace tekoj_test;

namespace {

// Restart markers of the scan in stream order (the number n of each RSTn).
std::vector<int> restart_markers(const Bytes& jpeg) {
    std::vector<int> out;
    for (size_t i = 0; i + 1 < jpeg.size(); ++i)
        if (jpeg[i] == 0xFF && jpeg[i + 1] >= 0xD0 && jpeg[i + 1] <= 0xD7) out.push_back(jpeg[i + 1] - 0xD0);
    return out;
}

struct CoefficientCase {
    std::vector<int16_t> coefficients;
    ImageInfo info;
    EncoderSettings settings;
};

CoefficientCase photo_setup(const Bytes& yuv, int width, int height, uint32_t size_estimate = 0) {
    CoefficientCase s{{}, image_info(yuv.data(), width, height, EKO_FORMAT_YUV420), settings_420(size_estimate)};
    s.coefficients = library_coefficients(s.info, &s.settings, 90);
    return s;
}

}  // namespace

TEST(ColumnSplit, JoinEqualsTheRowDriverStream) {
    struct Case { int width, height; size_t markers; };
    // One MCU row; ten MCU rows; odd sizes.
    for (const Case c : {Case{40, 16, 0}, Case{24, 160, 9}, Case{37, 21, 1}, Case{17, 130, 8}, Case{200, 40, 2}}) {
        SCOPED_TRACE(::testing::Message() << c.width << "x" << c.height);
        const Bytes yuv = rgb_to_yuv420(photo_rgb(c.width, c.height, 5), c.width, c.height);
        const CoefficientCase s = photo_setup(yuv, c.width, c.height, 1000);  // small estimate: row buffers must grow
        const Bytes rows = encode_coefficients(s.info, &s.settings, 90, s.coefficients, Sink::Memory, false);
        ASSERT_FALSE(rows.empty());
        for (Sink sink : {Sink::Memory, Sink::File, Sink::Stream})
            EXPECT_EQ(encode_coefficients(s.info, &s.settings, 90, s.coefficients, sink, true), rows);
        std::vector<int> expected(c.markers);
        for (size_t i = 0; i < expected.size(); ++i) expected[i] = static_cast<int>(i % 8);
        EXPECT_EQ(restart_markers(rows), expected);
        const Decoded d = decode_jpeg(rows);
        EXPECT_TRUE(d.ok && !d.warning) << d.message;
    }
}

TEST(ColumnSplit, RowBuffersAndTheSingleExactGrowthOfTheJoin) {
    const Bytes yuv = rgb_to_yuv420(photo_rgb(64, 480), 64, 480);
    for (const auto& [estimate, capacity] : {std::pair{100000u, 4167u}, {0u, 4096u}, {3000u, 4096u}, {0xFFFFFFFFu, 4096u}}) {
        const CoefficientCase s = photo_setup(yuv, 64, 480, estimate);  // 30 MCU rows of six blocks
        Output out(Sink::Memory);
        const EncodeOptions options{90, nullptr, 0};
        EncoderContext* ctx = eko_jpeg_enc_mcu_init(&s.info, &out.request, &options, &s.settings);
        ASSERT_TRUE(out.attach(ctx) && ctx != nullptr);
        ASSERT_EQ(__eko_jpeg_enc_col_encoder_init(ctx), 1u);
        for (uint32_t r = 0; r < 30; ++r) EXPECT_EQ(ctx->columns[r]->row_target->capacity, capacity);
        auto coefficients = s.coefficients;
        uint32_t next = 0;
        for (uint32_t x = 0; x < 4; ++x) {
            auto lists = block_lists(coefficients, 6, x, 30, 4);
            ASSERT_EQ(__eko_jpeg_enc_col_entroy_encoder(ctx, lists.data(), &next), 1u);
            EXPECT_EQ(next, 16 * (x + 1));
        }
        OutputTarget* main = ctx->saved_output;
        const uint32_t capacity_before = main->capacity;
        ASSERT_EQ(__eko_jpeg_enc_col_encoder_finish(ctx), 1u);
        EXPECT_EQ(ctx->output, main);
        // Grown once, to the joined stream plus six bytes for its end.
        EXPECT_GT(main->capacity, capacity_before);
        EXPECT_EQ(main->capacity, main->used + 6);
        const uint32_t joined = main->used;
        EXPECT_EQ(__eko_jpeg_enc_col_encoder_finish(ctx), 1u);  // a second join does nothing
        EXPECT_EQ(out.finish(ctx).size(), joined + 2u);
    }
}

TEST(ColumnSplit, RefusedWhereTheJoinCouldNotBeValid) {
    FaultScope scope;
    const int64_t live = live_blocks();
    {
        const Bytes yuv = rgb_to_yuv420(photo_rgb(32, 32), 32, 32);
        CoefficientCase s = photo_setup(yuv, 32, 32);
        const EncodeOptions options{90, nullptr, 0};
        const EncoderSettings no_dri = settings_420(0, 0);
        uint32_t next = 0;
        auto open = [&](const EncoderSettings* settings, Output& out) {
            EncoderContext* ctx = eko_jpeg_enc_mcu_init(&s.info, &out.request, &options, settings);
            out.attach(ctx);
            return ctx;
        };
        // No settings record; no DRI in the header; a band already coded.
        for (int k = 0; k < 3; ++k) {
            Output out(Sink::Memory);
            EncoderContext* ctx = open(k == 0 ? nullptr : k == 1 ? &no_dri : &s.settings, out);
            auto lists = block_lists(s.coefficients, 6, 0, 2, 1);
            if (k == 2) {
                ASSERT_EQ(__eko_jpeg_enc_entroy_encoder(ctx, lists.data(), &next), 1u);
            }
            EXPECT_EQ(__eko_jpeg_enc_col_encoder_init(ctx), 0u);
            EXPECT_EQ(ctx->columns, nullptr);
            EXPECT_EQ(__eko_jpeg_enc_col_entroy_encoder(ctx, lists.data(), &next), 0u);
            EXPECT_EQ(__eko_jpeg_enc_col_encoder_finish(ctx), 1u);  // never entered: nothing to do
            out.finish(ctx);
        }
        EXPECT_EQ(__eko_jpeg_enc_col_encoder_init(nullptr), 0u);
        EXPECT_EQ(__eko_jpeg_enc_col_encoder_finish(nullptr), 0u);

        // Out of order inside the mode: bands, a second set-up, a join with a
        // column missing, a column too many.
        Output out(Sink::Memory);
        EncoderContext* ctx = open(&s.settings, out);
        ASSERT_EQ(__eko_jpeg_enc_col_encoder_init(ctx), 1u);
        EXPECT_EQ(__eko_jpeg_enc_col_encoder_init(ctx), 0u);
        auto column0 = block_lists(s.coefficients, 6, 0, 2, 2), column1 = block_lists(s.coefficients, 6, 1, 2, 2);
        EXPECT_EQ(__eko_jpeg_enc_entroy_encoder(ctx, column0.data(), &next), 0u);
        EXPECT_EQ(__eko_jpeg_enc_col_entroy_encoder(ctx, column0.data(), nullptr), 0u);
        ASSERT_EQ(__eko_jpeg_enc_col_entroy_encoder(ctx, column0.data(), &next), 1u);
        EXPECT_EQ(__eko_jpeg_enc_col_encoder_finish(ctx), 0u);
        ASSERT_EQ(__eko_jpeg_enc_col_entroy_encoder(ctx, column1.data(), &next), 1u);
        EXPECT_EQ(__eko_jpeg_enc_col_entroy_encoder(ctx, column1.data(), &next), 0u);
        ASSERT_EQ(__eko_jpeg_enc_col_encoder_finish(ctx), 1u);
        EXPECT_EQ(__eko_jpeg_enc_entroy_encoder(ctx, column0.data(), &next), 0u);
        const Bytes joined = out.finish(ctx);
        EXPECT_EQ(joined, encode_coefficients(s.info, &s.settings, 90, photo_setup(yuv, 32, 32).coefficients,
                                              Sink::Memory, false));

        // Finishing the encode with the mode still set up releases the rows
        // and hands back no stream.
        Output abandoned(Sink::File);
        ctx = open(&s.settings, abandoned);
        ASSERT_EQ(__eko_jpeg_enc_col_encoder_init(ctx), 1u);
        ASSERT_EQ(__eko_jpeg_enc_col_entroy_encoder(ctx, column0.data(), &next), 1u);
        EXPECT_EQ(abandoned.finish(ctx), Bytes{});
    }
    EXPECT_EQ(live_blocks(), live);
}

TEST(ColumnSplit, AllocationFailureAnywhereLeaksNothing) {
    FaultScope scope;
    const Bytes rgb = photo_rgb(128, 160);
    const Bytes yuv = rgb_to_yuv420(rgb, 128, 160);
    const CoefficientCase s = photo_setup(yuv, 128, 160, 800);  // ten rows of 4096-byte buffers
    const Planes planes = yuv420_planes(rgb, 128, 160);
    const Bytes references[2] = {encode_bands(s.info, &planes, 90, Sink::Memory, &s.settings),
                                 encode_coefficients(s.info, &s.settings, 90, s.coefficients, Sink::Memory, true)};
    ASSERT_FALSE(references[0].empty() || references[1].empty());
    for (int mode = 0; mode < 2; ++mode) {
        for (int64_t n = 0;; ++n) {
            SCOPED_TRACE(::testing::Message() << "mode " << mode << ", allocation " << n);
            reset_counters();
            const int64_t live = live_blocks();
            fail_allocation(n);
            const Bytes got = mode == 0 ? encode_bands(s.info, &planes, 90, Sink::Memory, &s.settings)
                                        : encode_coefficients(s.info, &s.settings, 90, s.coefficients, Sink::Memory, true);
            const bool failure_injected = allocation_count() > n;
            fail_allocation(-1);
            EXPECT_EQ(live_blocks(), live);
            if (!got.empty() || !failure_injected) {
                EXPECT_EQ(got, references[mode]);
            }
            if (!failure_injected) break;
        }
    }

    // A set-up failing part-way releases what it made, and the encode goes on.
    const EncodeOptions options{90, nullptr, 0};
    for (int64_t n = 0; n < 1 + 3 * 10; ++n) {
        Output out(Sink::Memory);
        EncoderContext* ctx = eko_jpeg_enc_mcu_init(&s.info, &out.request, &options, &s.settings);
        ASSERT_TRUE(out.attach(ctx) && ctx != nullptr);
        const int64_t live = live_blocks();
        fail_allocation(n);
        EXPECT_EQ(__eko_jpeg_enc_col_encoder_init(ctx), 0u);
        fail_allocation(-1);
        EXPECT_EQ(eko_GetLastError(), uint32_t{EKO_ERR_ALLOC});
        EXPECT_EQ(ctx->columns, nullptr);
        EXPECT_EQ(live_blocks(), live);
        if (n == 30) {
            EXPECT_EQ(__eko_jpeg_enc_col_encoder_init(ctx), 1u);
            // The growth of the main buffer at the join fails: the join
            // refuses, frees the rows and hands back nothing.
            auto coefficients = s.coefficients;
            uint32_t next = 0;
            for (uint32_t x = 0; x < 8; ++x) {
                auto lists = block_lists(coefficients, 6, x, 10, 8);
                ASSERT_EQ(__eko_jpeg_enc_col_entroy_encoder(ctx, lists.data(), &next), 1u);
            }
            fail_allocation(0);
            EXPECT_EQ(__eko_jpeg_enc_col_encoder_finish(ctx), 0u);
            fail_allocation(-1);
            EXPECT_EQ(ctx->columns, nullptr);
            EXPECT_EQ(ctx->output->buffer, nullptr);
            uint32_t column = 0;
            auto lists = block_lists(coefficients, 6, 0, 10, 8);
            EXPECT_EQ(__eko_jpeg_enc_col_entroy_encoder(ctx, lists.data(), &column), 0u);
        }
        const Bytes result = out.finish(ctx);
        if (n == 30) {
            EXPECT_TRUE(result.empty());
        }
    }
}
