// Every SIMD level against the portable path, byte for byte: the transform
// kernel of each level the processor runs (called directly, so one process,
// the sanitizer build included, covers them all), and whole encodes at odd
// sizes pinned by digests of the portable path's streams. ctest repeats the
// whole-encode test with TEKOJ_SIMD set to each level.
#include <TekoJEncoder.h>

#include "core/forward_dct.h"
#include "core/quant_tables.h"
#include "core/simd_level.h"
#include "input/vu_split.h"
#include "support/test_support.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <memory>
#include <string>
#include <vector>

namespace {

using namespace tekoj_test;

constexpr tekoj::SimdLevel kLevels[] = {tekoj::SimdLevel::sse2, tekoj::SimdLevel::avx2, tekoj::SimdLevel::avx512,
                                        tekoj::SimdLevel::neon};

struct Lcg {
    uint32_t s;
    uint32_t next() { return s = s * 1664525u + 1013904223u; }
};

// Divisor tables: qualities 1..100 of both base tables, then caller tables
// with the extreme words (every entry 1: words 65536 and 32768; every entry
// 255) and random entries.
std::vector<std::vector<uint32_t>> divisor_tables() {
    std::vector<std::vector<uint8_t>> tables;
    for (uint32_t q = 1; q <= 100; ++q)
        for (const auto* base : {eko_luminanceQuantTbl[0], eko_chrominanceQuantTbl[0]}) {
            std::vector<uint8_t> t(64);
            tekoj::scale_table(base, tekoj::quality_scale(q), t.data());
            tables.push_back(t);
        }
    tables.emplace_back(64, 1);
    tables.emplace_back(64, 2);
    tables.emplace_back(64, 255);
    Lcg rng{7};
    for (int k = 0; k < 8; ++k) {
        std::vector<uint8_t> t(64);
        for (auto& v : t) v = static_cast<uint8_t>(1 + rng.next() % (k < 4 ? 8 : 255));
        tables.push_back(t);
    }
    std::vector<std::vector<uint32_t>> out;
    for (const auto& t : tables) {
        std::vector<uint32_t> d(64);
        for (int i = 0; i < 64; ++i) d[i] = tekoj::divisor_for(t[i], i);
        out.push_back(d);
    }
    return out;
}

// Sample strips of 8 rows and 3 blocks each, in heap blocks that end with
// the last block (an over-read shows in the sanitizer build): extremes (flat
// 0, flat 255, the sign pattern of every basis function, 0/255 noise) and
// random samples.
std::vector<Bytes> sample_strips() {
    std::vector<Bytes> strips;
    const int w = 24;
    auto strip = [&](auto sample) {
        Bytes s(8 * w);
        for (int y = 0; y < 8; ++y)
            for (int x = 0; x < w; ++x) s[y * w + x] = sample(x, y);
        strips.push_back(s);
    };
    strip([](int, int) { return uint8_t{0}; });
    strip([](int, int) { return uint8_t{255}; });
    for (int v = 0; v < 8; ++v)
        for (int u = 0; u < 8; ++u)
            for (int flip = 0; flip < 2; ++flip)
                strip([&](int x, int y) {
                    const double b = std::cos((2 * (x % 8) + 1) * u * M_PI / 16) * std::cos((2 * y + 1) * v * M_PI / 16);
                    return uint8_t((b > 0) != (flip != 0) ? 255 : 0);
                });
    Lcg rng{11};
    for (int k = 0; k < 64; ++k) strip([&](int, int) { return uint8_t(rng.next() >> 24 & 1 ? 255 : 0); });
    for (int k = 0; k < 64; ++k) strip([&](int, int) { return uint8_t(rng.next() >> 24); });
    return strips;
}

TEST(SimdEquivalence, TransformKernelsMatchThePortableOneOnEveryTable) {
    const auto tables = divisor_tables();
    const auto strips = sample_strips();
    int levels_run = 0;
    for (tekoj::SimdLevel level : kLevels) {
        if (!tekoj::simd_supported(level)) continue;
        ++levels_run;
        const tekoj::FdctBlocksFn kernel = tekoj::fdct_blocks_for(level);
        ASSERT_NE(kernel, &tekoj::fdct_blocks_portable) << tekoj::simd_level_name(level);
        for (size_t t = 0; t < tables.size(); ++t) {
            tekoj::QuantTable quant;
            tekoj::prepare_quant_table(tables[t].data(), quant);
            for (const Bytes& s : strips) {
                const size_t row_bytes = s.size() / 8;
                const auto heap = std::make_unique<uint8_t[]>(s.size());
                std::memcpy(heap.get(), s.data(), s.size());
                const uint8_t* rows[8];
                for (int y = 0; y < 8; ++y) rows[y] = heap.get() + y * row_bytes;
                for (const auto& [col, count] : {std::pair{0u, 3u}, std::pair{8u, 2u}, std::pair{16u, 1u}}) {
                    int16_t want[3 * 64], got[3 * 64];
                    tekoj::fdct_blocks_portable(rows, col, count, quant, want);
                    kernel(rows, col, count, quant, got);
                    ASSERT_EQ(std::memcmp(want, got, count * 128), 0)
                        << tekoj::simd_level_name(level) << " table " << t << " col " << col;
                }
            }
        }
    }
    std::printf("transform kernels checked at %d SIMD level(s)\n", levels_run);
}

TEST(SimdEquivalence, PortableKernelMatchesTheWideReference) {
    // The 32-bit product of the kernels against the 64-bit one of the exported
    // step's fallback, on every table and strip.
    for (const auto& d : divisor_tables()) {
        tekoj::QuantTable quant;
        tekoj::prepare_quant_table(d.data(), quant);
        for (const Bytes& s : sample_strips()) {
            const uint8_t* rows[8];
            for (int y = 0; y < 8; ++y) rows[y] = s.data() + y * 24;
            int16_t got[64], want[64];
            tekoj::fdct_blocks_portable(rows, 0, 1, quant, got);
            tekoj::dct_detail::block(
                rows, 0, [&](int i, int32_t x) { return tekoj::dct_detail::quantise_wide(x, d[i]); }, want);
            ASSERT_EQ(std::memcmp(got, want, sizeof got), 0);
        }
    }
}

TEST(SimdEquivalence, VuSplitKernelsMatchThePortableOne) {
    // Every length up to several vector widths, from a heap block that ends
    // with the last pair.
    for (tekoj::SimdLevel level : kLevels) {
        if (!tekoj::simd_supported(level)) continue;
        const tekoj::SplitVuFn split = tekoj::split_vu_for(level);
        ASSERT_NE(split, &tekoj::split_vu_portable) << tekoj::simd_level_name(level);
        for (uint32_t n = 0; n <= 70; ++n) {
            const auto src = std::make_unique<uint8_t[]>(2 * n + (n == 0));
            for (uint32_t i = 0; i < 2 * n; ++i) src[i] = static_cast<uint8_t>(i * 37 + n);
            Bytes cr(n + 1, 0xEE), cb(n + 1, 0xEE), want_cr(n + 1, 0xEE), want_cb(n + 1, 0xEE);
            split(src.get(), n, cr.data(), cb.data());
            tekoj::split_vu_portable(src.get(), n, want_cr.data(), want_cb.data());
            EXPECT_TRUE(cr == want_cr && cb == want_cb) << tekoj::simd_level_name(level) << " n=" << n;
        }
    }
}

uint64_t fnv1a(uint64_t h, const Bytes& b) {
    for (uint8_t v : b) h = (h ^ v) * 0x100000001b3ull;
    return h;
}

// A luma plane followed by an interleaved V/U plane, through the exported
// steps with the interleaved reader.
Bytes encode_vu(const Bytes& image, int w, int h, uint32_t quality) {
    ImageInfo info = image_info(image.data(), w, h, EKO_FORMAT_YUV420);
    OutputRequest out{EKO_OUTPUT_MEMORY, nullptr, static_cast<uint8_t*>(DORVATEKO_OsMalloc(4096)), 4096};
    const EncodeOptions options{quality, nullptr, 0};
    EncoderContext* ctx = __eko_jpeg_enc_initiaize(&info, &out, &options, nullptr);
    if (ctx == nullptr) return {};
    ctx->plane_v = image.data() + static_cast<size_t>(w) * h;
    __eko_jpeg_enc_make_header(ctx);
    for (uint32_t band = 0; band < ctx->total_imcu_rows; ++band, ++ctx->sample_rows->band_counter) {
        __eko_jpeg_enc_get_raw_pvu_data(ctx);
        __eko_jpeg_enc_compress_data(ctx, ctx->sample_rows->row_arrays);
    }
    __eko_jpeg_enc_make_end_mark(ctx);
    Bytes stream(ctx->output->buffer, ctx->output->buffer + ctx->output->total);
    DORVATEKO_OsFree(ctx->output->buffer);
    __eko_jpeg_enc_release_mem(ctx);
    DORVATEKO_OsFree(ctx);
    return stream;
}

// Digest of the streams of every size 1..48 x 1..48 and a few large odd
// ones, random samples, quality varying with the size.
uint64_t digest(const std::string& format) {
    uint64_t h = 0xcbf29ce484222325ull;
    std::vector<std::pair<int, int>> sizes;
    for (int w = 1; w <= 48; ++w)
        for (int hgt = 1; hgt <= 48; ++hgt) sizes.emplace_back(w, hgt);
    sizes.insert(sizes.end(), {{1001, 67}, {333, 517}, {2047, 9}});
    for (const auto& [w, hgt] : sizes) {
        const uint32_t quality = 1 + static_cast<uint32_t>(w * 7 + hgt * 13) % 100;
        const uint32_t fmt = format == "grey" ? EKO_FORMAT_GREY : format == "rgb888" ? EKO_FORMAT_RGB888 : EKO_FORMAT_YUV420;
        Bytes image(image_size(fmt, w, hgt));
        Lcg rng{static_cast<uint32_t>(w * 131 + hgt)};
        for (auto& v : image) v = static_cast<uint8_t>(rng.next() >> 24);
        const Bytes stream =
            format == "vu" ? encode_vu(image, w, hgt, quality) : encode_to_memory(image_info(image.data(), w, hgt, fmt), quality);
        EXPECT_FALSE(stream.empty()) << format << " " << w << "x" << hgt;
        h = fnv1a(h, stream);
    }
    return h;
}

TEST(SimdEquivalence, WholeEncodesMatchThePortablePath) {
    // Digests of the portable path's streams (TEKOJ_SIMD=portable).
    const struct { const char* format; uint64_t digest; } cases[] = {
        {"yuv420", 0x6c91be858015d775ull}, {"grey", 0xd207c478a7394914ull}, {"vu", 0x3e601c92e5086e0cull}, {"rgb888", 0x77dac82c212bceb8ull}};
    for (const auto& c : cases)
        EXPECT_EQ(digest(c.format), c.digest) << c.format << " at level " << tekoj::simd_level_name(tekoj::simd_level());
}

}  // namespace
