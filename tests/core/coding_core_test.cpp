// Coding core: header bytes against libjpeg-turbo's own header, quantisation
// tables at every quality, the forward transform, the Huffman tables, the bit
// writer with its padding and restart steps, and coefficient blocks read back
// by libjpeg.
#include <TekoJEncoderInternal.h>

#include "support/test_support.h"

#include <gtest/gtest.h>
#include <turbojpeg.h>

#include <algorithm>
#include <array>
#include <string>
#include <utility>
#include <vector>

using namespace tekoj_test;

namespace {

constexpr uint8_t kZigzag[64] = {0,  1,  8,  16, 9,  2,  3,  10, 17, 24, 32, 25, 18, 11, 4,  5,  12, 19, 26, 33, 40, 48,
                                 41, 34, 27, 20, 13, 6,  7,  14, 21, 28, 35, 42, 49, 56, 57, 50, 43, 36, 29, 22, 15, 23,
                                 30, 37, 44, 51, 58, 59, 52, 45, 38, 31, 39, 46, 53, 60, 61, 54, 47, 55, 62, 63};

size_t header_length(const Bytes& j) {
    size_t n = 0;
    for (const Bytes& s : header_segments(j)) n += s.size();
    return n;
}

Bytes turbo_jpeg(const Bytes& rgb, int w, int h, int quality, bool grey) {
    tjhandle t = tjInitCompress();
    unsigned char* out = nullptr;
    unsigned long size = 0;
    EXPECT_EQ(tjCompress2(t, rgb.data(), w, 0, h, TJPF_RGB, &out, &size, grey ? TJSAMP_GRAY : TJSAMP_420, quality, 0), 0);
    Bytes b(out, out + size);
    tjFree(out);
    tjDestroy(t);
    return b;
}

// Our header must be libjpeg-turbo's (same tables, same JFIF segment) plus
// the DRI segment before SOS.
void expect_turbo_header_plus_dri(const Bytes& ours, const Bytes& turbo, uint16_t dri) {
    std::vector<Bytes> expected = header_segments(turbo);
    expected.insert(expected.end() - 1, Bytes{0xFF, 0xDD, 0x00, 0x04, uint8_t(dri >> 8), uint8_t(dri)});
    EXPECT_EQ(header_segments(ours), expected);
}

// Grey samples for the contexts the bit writer and block coder write through.
const Bytes kGrey(64 * 64, 0x80);

}  // namespace

TEST(Header, HeadersAreLibjpegTurbosPlusAnMcuRowDriAtEveryQuality) {
    // 640 x 480 colour: 629 bytes, DRI 40; 100 x 100 grey: 334 bytes, DRI 13.
    const Bytes rgb = photo_rgb(640, 480), grey_rgb = photo_rgb(100, 100), grey = rgb_to_grey(grey_rgb, 100, 100);
    const Bytes colour_jpeg = encode_to_memory(image_info(rgb.data(), 640, 480, EKO_FORMAT_RGB888), 50);
    const Bytes grey_jpeg = encode_to_memory(image_info(grey.data(), 100, 100, EKO_FORMAT_GREY), 50);
    EXPECT_EQ(header_length(colour_jpeg), 629u);
    EXPECT_EQ(header_length(grey_jpeg), 334u);
    expect_turbo_header_plus_dri(colour_jpeg, turbo_jpeg(rgb, 640, 480, 50, false), 40);
    expect_turbo_header_plus_dri(grey_jpeg, turbo_jpeg(grey_rgb, 100, 100, 50, true), 13);
    // 16 x 16 at every quality; 0 counts as 1, above 100 as 100.
    const Bytes small = photo_rgb(16, 16), small_grey = rgb_to_grey(small, 16, 16);
    for (uint32_t q = 0; q <= 102; ++q) {
        SCOPED_TRACE(q);
        const int turbo_q = std::clamp(static_cast<int>(q), 1, 100);
        expect_turbo_header_plus_dri(encode_to_memory(image_info(small.data(), 16, 16, EKO_FORMAT_RGB888), q),
                                     turbo_jpeg(small, 16, 16, turbo_q, false), 1);
        expect_turbo_header_plus_dri(encode_to_memory(image_info(small_grey.data(), 16, 16, EKO_FORMAT_GREY), q),
                                     turbo_jpeg(small, 16, 16, turbo_q, true), 2);
    }
    // The interval is one MCU row, in two bytes.
    const struct { uint32_t format; int width; uint16_t dri; } cases[] = {
        {EKO_FORMAT_YUV420, 49999, 3125}, {EKO_FORMAT_RGBA8888, 49999, 3125}, {EKO_FORMAT_GREY, 49999, 6250},
        {EKO_FORMAT_RGB565, 17, 2},       {EKO_FORMAT_GREY, 17, 3},           {EKO_FORMAT_BGRA8888, 1, 1}};
    const Bytes row(49999 * 4, 0x33);
    for (const auto& c : cases) {
        const std::vector<Bytes> segs = header_segments(encode_to_memory(image_info(row.data(), c.width, 1, c.format), 75));
        ASSERT_GE(segs.size(), 2u);
        EXPECT_EQ(segs[segs.size() - 2], (Bytes{0xFF, 0xDD, 0, 4, uint8_t(c.dri >> 8), uint8_t(c.dri)})) << c.width;
    }
}

TEST(ForwardDct, DefinedExamples) {
    // Uniform blocks and DC rounding: positive truncates, negative rounds.
    const struct { int fill, changed; int16_t dc; } cases[] = {
        {128, 128, 0}, {255, 255, 63}, {0, 0, -64}, {128, 64, 0}, {128, 63, -1}, {128, 192, 0}, {128, 255, 0}};
    const std::vector<uint32_t> divisors(64, 512);
    for (const auto& c : cases) {
        std::array<std::array<uint8_t, 8>, 8> samples;
        uint8_t* rows[8];
        for (int y = 0; y < 8; ++y) samples[y].fill(static_cast<uint8_t>(c.fill)), rows[y] = samples[y].data();
        samples[3][4] = static_cast<uint8_t>(c.changed);
        int16_t out[64];
        BlockPosition pos{0, 0, 1};
        __eko_jpeg_enc_do_forward_dct(divisors.data(), nullptr, rows, out, &pos);
        EXPECT_EQ(out[0], c.dc) << c.fill << " " << c.changed;
        for (int i = 1; i < 64 && c.fill == c.changed; ++i) EXPECT_EQ(out[i], 0) << c.fill;
    }
}

TEST(BitWriter, StuffingPaddingAndRestartStep) {
    Context coder(image_info(kGrey.data(), 24, 8, EKO_FORMAT_GREY));
    EncoderContext* ctx = coder.ctx;
    WorkingState ws{0, 0, {5, 6, 7}, ctx};
    __eko_jpeg_enc_write_bits(&ws, 0xFF, 8);     // FF, stuffed
    __eko_jpeg_enc_write_bits(&ws, 0x1234, 16);  // two bytes at once
    __eko_jpeg_enc_write_bits(&ws, 0xFD, 3);     // only the low bits: 101 waits
    EXPECT_EQ(coder.written(), (Bytes{0xFF, 0x00, 0x12, 0x34}));
    EXPECT_EQ(ws.put_bits, 3);
    // Restart step: nothing before the first MCU, then a marker where due,
    // after padding the waiting bits with ones; predictors back to 0.
    ASSERT_EQ(ctx->restart_interval, 3u);
    EXPECT_EQ(__eko_jpeg_write_restart_marker(ctx, &ws), 1u);
    EXPECT_TRUE(ctx->restart_mcu_count == 1 && coder.written().size() == 4);
    ctx->restart_mcu_count = 3;
    EXPECT_EQ(__eko_jpeg_write_restart_marker(ctx, &ws), 1u);
    EXPECT_EQ(coder.written(4), (Bytes{0xBF, 0xFF, 0xD0}));
    EXPECT_TRUE(ws.put_bits == 0 && ws.last_dc_val[0] == 0);
    EXPECT_TRUE(ctx->restart_index == 1 && ctx->restart_mcu_count == 4);
    // Completion pads with ones: nothing waiting, 101 waiting, 1111111 waiting.
    const struct { uint32_t bits, size; Bytes tail; } pads[] = {
        {0, 0, {0xFF, 0xD9}}, {5, 3, {0xBF, 0xFF, 0xD9}}, {0x7F, 7, {0xFF, 0x00, 0xFF, 0xD9}}};
    for (const auto& p : pads) {
        Context fresh(image_info(kGrey.data(), 8, 8, EKO_FORMAT_GREY));
        WorkingState w{0, 0, {0, 0, 0}, fresh.ctx};
        __eko_jpeg_enc_write_bits(&w, p.bits, p.size);
        fresh.ctx->entropy->put_buffer = w.put_buffer;
        fresh.ctx->entropy->put_bits = w.put_bits;
        EXPECT_EQ(__eko_jpeg_enc_make_end_mark(fresh.ctx), 1u);
        EXPECT_TRUE(fresh.written() == p.tail && fresh.ctx->output->total == p.tail.size()) << p.size;
    }
}

TEST(BlockCoder, CoefficientsReadBackByLibjpeg) {
    // Random and extreme blocks coded through the exported block coder, read
    // back as coefficients: position 63 comes back 0, AC values beyond the
    // baseline categories come back clamped to +-1023, every write stays
    // inside the target, and RST markers reset the predictor in step.
    Context coder(image_info(kGrey.data(), 64, 64, EKO_FORMAT_GREY));
    EncoderContext* ctx = coder.ctx;
    ASSERT_EQ(__eko_jpeg_enc_make_header(ctx), 1u);
    uint32_t seed = 64;
    auto rng = [&] { return (seed = seed * 1664525u + 1013904223u) >> 8; };
    std::vector<std::array<int16_t, 64>> sent;
    int16_t* const block = ctx->mcu_state->mcu_buffer[0];
    for (int m = 0; m < 64; ++m) {
        auto& expect = sent.emplace_back();
        // Every third block is worst-case: the longest codes with all-ones
        // extra bits, the most stuffed FF bytes.
        for (int k = 0; k < 64; ++k) {
            int v = m % 3 == 0 ? 1023
                  : m % 3 == 1 ? (k % 2 ? 1 : -1) * (2000 + k)  // beyond category 10
                  : m % 4 == 0 ? (k == 21 || k == 63 ? -1 : 0)  // a run of 20, then the last position
                               : (rng() % 6 == 0 ? static_cast<int>(rng() % 201) - 100 : 0);
            if (k == 0) v = static_cast<int>(rng() % 2041) - 1024;
            block[kZigzag[k]] = static_cast<int16_t>(v);
            expect[kZigzag[k]] = static_cast<int16_t>(k == 63 ? 0 : k == 0 ? v : std::clamp(v, -1023, 1023));
        }
        ASSERT_EQ(__eko_jpeg_enc_encode_1mcu_blk(ctx, ctx->mcu_state->mcu_buffer), 1u);
        ASSERT_LE(ctx->output->used, ctx->output->capacity);
        EXPECT_EQ(block[63], 0);
    }
    ASSERT_EQ(__eko_jpeg_enc_make_end_mark(ctx), 1u);
    std::vector<int16_t> flat;
    for (const auto& b : sent) flat.insert(flat.end(), b.begin(), b.end());
    EXPECT_EQ(coefficients_of(Bytes(ctx->output->buffer, ctx->output->buffer + ctx->output->total)), flat);
}

TEST(BlockCoder, RestartMarkersFollowEachMcuRowInSequence) {
    // Every marker after the header, the end marker last.
    const struct { uint32_t format; int w, h; std::vector<uint8_t> markers; } cases[] = {
        {EKO_FORMAT_YUV420, 32, 160, {0xD0, 0xD1, 0xD2, 0xD3, 0xD4, 0xD5, 0xD6, 0xD7, 0xD0, 0xD9}},
        {EKO_FORMAT_GREY, 24, 24, {0xD0, 0xD1, 0xD9}}, {EKO_FORMAT_GREY, 100, 8, {0xD9}}};
    for (const auto& c : cases) {
        const Bytes px = rgb_to_format(photo_rgb(c.w, c.h, 4), c.w, c.h, c.format);
        const Bytes j = encode_to_memory(image_info(px.data(), c.w, c.h, c.format), 100);
        std::vector<uint8_t> found;
        for (size_t i = header_length(j); i + 1 < j.size(); ++i)
            if (j[i] == 0xFF && j[i + 1] != 0x00) found.push_back(j[++i]);
        EXPECT_EQ(found, c.markers) << c.w << "x" << c.h;
    }
}

