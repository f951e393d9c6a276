// Block kernels: every SIMD level this processor runs codes exactly the bytes
// of the portable kernel, on random and extreme blocks, from any accumulator
// state, and in whole streams of pixels and of a caller's coefficient blocks.
#include <TekoJEncoder.h>

#include "core/entropy_coder.h"
#include "core/simd_level.h"
#include "support/test_support.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <vector>

using namespace tekoj_test;

namespace {

using Block = std::array<int16_t, 64>;

std::vector<tekoj::SimdLevel> fast_levels() {
    std::vector<tekoj::SimdLevel> levels;
    for (auto l : {tekoj::SimdLevel::sse2, tekoj::SimdLevel::avx2, tekoj::SimdLevel::avx512, tekoj::SimdLevel::neon})
        if (tekoj::simd_supported(l)) levels.push_back(l);
    return levels;
}

// Blocks that probe the kernels' corners: empty, full, the int16 extremes,
// values either side of the baseline limits, runs longer than 16 zeros, a
// lone value at the last position (never coded), random sparse and dense.
std::vector<Block> probe_blocks() {
    uint32_t seed = 7;
    auto rng = [&] { return (seed = seed * 1664525u + 1013904223u) >> 8; };
    const int16_t extremes[] = {-32768, 32767, -1024, 1024, -1023, 1023, -2048, 2048, -1, 1, 0};
    std::vector<Block> blocks;
    for (int m = 0; m < 600; ++m) {
        Block& b = blocks.emplace_back();
        for (int i = 0; i < 64; ++i) {
            const uint32_t r = rng();
            switch (m % 6) {
                case 0: b[i] = 0; break;
                case 1: b[i] = extremes[r % 11]; break;
                case 2: b[i] = static_cast<int16_t>(r); break;
                case 3: b[i] = r % 9 == 0 ? static_cast<int16_t>(static_cast<int>(r % 2047) - 1023) : 0; break;
                case 4: b[i] = i == 63 || (i == 1 + static_cast<int>(r % 3)) ? -1 : 0; break;
                default: b[i] = r % 3 == 0 ? static_cast<int16_t>(static_cast<int>(r % 31) - 15) : 0; break;
            }
        }
    }
    return blocks;
}

// Codes the blocks with one kernel from a given accumulator state; the bytes
// and the state left behind.
Bytes run_kernel(tekoj::BlockKernel kernel, const std::vector<Block>& blocks, const uint32_t* dc, const uint32_t* ac,
                 int pending, tekoj::BitState& end) {
    Bytes out(blocks.size() * tekoj::kBlockWorstCase + 64);
    tekoj::BitState s{static_cast<tekoj::BitAcc>(0x5A5A5A5A5A5A5A5Aull), static_cast<int32_t>(sizeof(tekoj::BitAcc) * 8) - pending,
                      out.data()};
    int32_t diff = 0;
    for (const Block& b : blocks) {
        kernel(s, std::clamp(b[0] - diff, -2047, 2047), b.data(), dc, ac);
        diff = b[0];
    }
    out.resize(static_cast<size_t>(s.out - out.data()));
    end = s;
    return out;
}

// A memory-target context whose coder runs the kernel of `level`.
EncoderContext* context_for(const ImageInfo& info, uint32_t quality, tekoj::SimdLevel level) {
    const OutputRequest request{EKO_OUTPUT_MEMORY, nullptr, static_cast<uint8_t*>(DORVATEKO_OsMalloc(4096)), 4096};
    const EncodeOptions options{quality, nullptr, 0};
    EncoderContext* ctx = __eko_jpeg_enc_initiaize(&info, &request, &options, nullptr);
    const tekoj::CoderKernels kernels = tekoj::coder_kernels_for(static_cast<int>(level));
    ctx->coder_tables->kernel = kernels.block;
    ctx->coder_tables->mcu_kernel = kernels.mcu;
    return ctx;
}

Bytes finish(EncoderContext* ctx) {
    EXPECT_EQ(__eko_jpeg_enc_make_end_mark(ctx), 1u);
    const Bytes out(ctx->output->buffer, ctx->output->buffer + ctx->output->total);
    DORVATEKO_OsFree(ctx->output->buffer);
    __eko_jpeg_enc_release_mem(ctx);
    DORVATEKO_OsFree(ctx);
    return out;
}

}  // namespace

TEST(BlockKernels, EveryLevelCodesThePortableBytesFromEveryAccumulatorState) {
    const std::vector<Block> blocks = probe_blocks();
    const Bytes px(64, 0x80);
    EncoderContext* ctx = context_for(image_info(px.data(), 8, 8, EKO_FORMAT_GREY), 75, tekoj::SimdLevel::portable);
    const tekoj::CoderTables* t = ctx->coder_tables;
    const tekoj::BlockKernel portable = tekoj::coder_kernels_for(static_cast<int>(tekoj::SimdLevel::portable)).block;
    for (tekoj::SimdLevel level : fast_levels()) {
        SCOPED_TRACE(tekoj::simd_level_name(level));
        for (int table = 0; table < 2; ++table) {
            for (int pending : {0, 1, 7, 8, 31, static_cast<int>(sizeof(tekoj::BitAcc) * 8) - 1}) {
                tekoj::BitState a{}, b{};
                const Bytes want = run_kernel(portable, blocks, t->dc[table], t->ac[table], pending, a);
                const Bytes got = run_kernel(tekoj::coder_kernels_for(static_cast<int>(level)).block, blocks, t->dc[table],
                                             t->ac[table], pending, b);
                EXPECT_EQ(got, want) << "table " << table << ", " << pending << " bits waiting";
                const int left = static_cast<int>(sizeof(tekoj::BitAcc) * 8) - a.free;
                const tekoj::BitAcc low = left == 0 ? 0 : static_cast<tekoj::BitAcc>(~tekoj::BitAcc{0} >> (sizeof(tekoj::BitAcc) * 8 - left));
                EXPECT_TRUE(a.free == b.free && (a.acc & low) == (b.acc & low));
            }
        }
    }
    finish(ctx);
}

TEST(BlockKernels, EveryLevelCodesThePortableStreamsOfPixelsAndCallerBlocks) {
    const int w = 77, h = 45;
    const Bytes rgb = photo_rgb(w, h, 3);
    const std::vector<Block> probes = probe_blocks();
    std::vector<tekoj::SimdLevel> levels = fast_levels();
    levels.insert(levels.begin(), tekoj::SimdLevel::portable);
    std::vector<Bytes> pixel_streams, block_streams;
    std::vector<std::vector<Block>> blocks_after;
    for (tekoj::SimdLevel level : levels) {
        const ImageInfo info = image_info(rgb.data(), w, h, EKO_FORMAT_RGB888);
        EncoderContext* ctx = context_for(info, 97, level);
        __eko_jpeg_enc_make_header(ctx);
        for (int band = 0; band < (h + 15) / 16; ++band) __eko_jpeg_enc_process_image_data(ctx);
        pixel_streams.push_back(finish(ctx));

        // Caller blocks through the exported block coder, extremes included;
        // the coder clamps what it codes and zeroes only position 63.
        ctx = context_for(info, 97, level);
        __eko_jpeg_enc_make_header(ctx);
        std::vector<Block> blocks = probes;
        for (size_t m = 0; m + 6 <= blocks.size(); m += 6) {
            int16_t* list[10];
            for (int k = 0; k < 6; ++k) list[k] = blocks[m + static_cast<size_t>(k)].data();
            ASSERT_EQ(__eko_jpeg_enc_encode_1mcu_blk(ctx, list), 1u);
        }
        block_streams.push_back(finish(ctx));
        blocks_after.push_back(blocks);
    }
    EXPECT_TRUE(decode_jpeg(pixel_streams[0]).ok);
    for (size_t i = 1; i < levels.size(); ++i) {
        SCOPED_TRACE(tekoj::simd_level_name(levels[i]));
        EXPECT_EQ(pixel_streams[i], pixel_streams[0]);
        EXPECT_EQ(block_streams[i], block_streams[0]);
        EXPECT_EQ(blocks_after[i], blocks_after[0]);
    }
    for (size_t m = 0; m < probes.size(); ++m) {
        Block expect = probes[m];
        expect[63] = 0;
        ASSERT_EQ(blocks_after[0][m], expect) << m;
    }
}
