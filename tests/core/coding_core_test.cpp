// Coding core: header bytes against libjpeg-turbo's own header, quantisation
// tables at every quality, the forward transform against a float DCT, the
// Huffman tables, the bit writer with its padding and restart steps, and
// coefficient blocks read back by libjpeg.
#include <TekoJEncoder.h>

#include "support/test_support.h"

#include <gtest/gtest.h>
#include <jpeglib.h>
#include <turbojpeg.h>

#include <algorithm>
#include <array>
#include <bit>
#include <csetjmp>
#include <cstring>
#include <random>
#include <string>
#include <vector>

using namespace tekoj_test;

namespace {

constexpr uint8_t kZigzag[64] = {0,  1,  8,  16, 9,  2,  3,  10, 17, 24, 32, 25, 18, 11, 4,  5,  12, 19, 26, 33, 40, 48,
                                 41, 34, 27, 20, 13, 6,  7,  14, 21, 28, 35, 42, 49, 56, 57, 50, 43, 36, 29, 22, 15, 23,
                                 30, 37, 44, 51, 58, 59, 52, 45, 38, 31, 39, 46, 53, 60, 61, 54, 47, 55, 62, 63};
// Segments of a stream's header, SOI first and SOS last, markers included.
std::vector<Bytes> header_segments(const Bytes& j) {
    std::vector<Bytes> out{Bytes(j.begin(), j.begin() + 2)};
    for (size_t i = 2; i + 4 <= j.size();) {
        const size_t len = size_t(j[i + 2]) << 8 | j[i + 3];
        out.emplace_back(j.begin() + long(i), j.begin() + long(i + 2 + len));
        if (j[i + 1] == 0xDA) break;
        i += 2 + len;
    }
    return out;
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

// A memory-target context for an image of the given size and format.
struct Coder {
    Bytes pixels;
    EncoderContext* ctx;
    Coder(int w, int h, uint32_t format, uint32_t quality = 75) : pixels(image_size(format, w, h), 0x80) {
        const ImageInfo info = image_info(pixels.data(), w, h, format);
        const OutputRequest request{EKO_OUTPUT_MEMORY, nullptr, static_cast<uint8_t*>(DORVATEKO_OsMalloc(2048)), 2048};
        const EncodeOptions options{quality, nullptr, 0};
        ctx = __eko_jpeg_enc_initiaize(&info, &request, &options, nullptr);
    }
    ~Coder() {
        DORVATEKO_OsFree(ctx->output->buffer);
        __eko_jpeg_enc_release_mem(ctx);
        DORVATEKO_OsFree(ctx);
    }
    Bytes written(size_t from = 0) const { return Bytes(ctx->output->buffer + from, ctx->output->buffer + ctx->output->used); }
};

// Quantised coefficient blocks read back by libjpeg: per component, block
// rows of the MCU-padded coefficient arrays.
struct Coefficients {
    std::vector<std::vector<std::array<int16_t, 64>>> blocks;  // [component][row * cols + col]
    std::vector<int> cols;
    int warnings = 0;
    bool ok = false;
};

struct ErrorManager {
    jpeg_error_mgr pub;
    jmp_buf jump;
    int* warnings;
};

void read_coefficients(const Bytes& jpeg, Coefficients& out) {
    jpeg_decompress_struct cinfo;
    ErrorManager err;
    cinfo.err = jpeg_std_error(&err.pub);
    err.warnings = &out.warnings;
    err.pub.error_exit = [](j_common_ptr c) { longjmp(reinterpret_cast<ErrorManager*>(c->err)->jump, 1); };
    err.pub.emit_message = [](j_common_ptr c, int level) {
        if (level < 0) ++*reinterpret_cast<ErrorManager*>(c->err)->warnings;
    };
    if (setjmp(err.jump)) {
        jpeg_destroy_decompress(&cinfo);
        return;
    }
    jpeg_create_decompress(&cinfo);
    jpeg_mem_src(&cinfo, jpeg.data(), static_cast<unsigned long>(jpeg.size()));
    jpeg_read_header(&cinfo, TRUE);
    jvirt_barray_ptr* arrays = jpeg_read_coefficients(&cinfo);
    out.blocks.resize(cinfo.num_components);
    out.cols.resize(cinfo.num_components);
    for (int c = 0; c < cinfo.num_components; ++c) {
        const jpeg_component_info& comp = cinfo.comp_info[c];
        const int rows = (comp.height_in_blocks + comp.v_samp_factor - 1) / comp.v_samp_factor * comp.v_samp_factor;
        out.cols[c] = (comp.width_in_blocks + comp.h_samp_factor - 1) / comp.h_samp_factor * comp.h_samp_factor;
        for (int r = 0; r < rows; ++r) {
            JBLOCKARRAY row = cinfo.mem->access_virt_barray(reinterpret_cast<j_common_ptr>(&cinfo), arrays[c], r, 1, FALSE);
            for (int x = 0; x < out.cols[c]; ++x) {
                std::array<int16_t, 64> b;
                for (int i = 0; i < 64; ++i) b[i] = row[0][x][i];
                out.blocks[c].push_back(b);
            }
        }
    }
    jpeg_finish_decompress(&cinfo);
    jpeg_destroy_decompress(&cinfo);
    out.ok = true;
}

}  // namespace

TEST(Header, ColourAndGreyHeadersAreLibjpegTurbosPlusOneMcuRowDri) {
    // 640 x 480 colour: 629 bytes; 100 x 100 grey: 334 bytes, DRI 13.
    const Bytes rgb = photo_rgb(640, 480);
    const Bytes colour = encode_to_memory(image_info(rgb.data(), 640, 480, EKO_FORMAT_RGB888), 50);
    const std::vector<Bytes> segs = header_segments(colour);
    size_t length = 0;
    for (const Bytes& s : segs) length += s.size();
    EXPECT_EQ(length, 629u);
    EXPECT_EQ(Bytes(colour.begin(), colour.begin() + 25),
              (Bytes{0xFF, 0xD8, 0xFF, 0xE0, 0x00, 0x10, 0x4A, 0x46, 0x49, 0x46, 0x00, 0x01, 0x01,
                     0x00, 0x00, 0x01, 0x00, 0x01, 0x00, 0x00, 0xFF, 0xDB, 0x00, 0x43, 0x00}));
    EXPECT_EQ(Bytes(colour.begin() + 25, colour.begin() + 33), (Bytes{16, 11, 12, 14, 12, 10, 16, 14}));
    EXPECT_EQ(segs[4], (Bytes{0xFF, 0xC0, 0x00, 0x11, 0x08, 0x01, 0xE0, 0x02, 0x80, 0x03, 0x01, 0x22, 0x00, 0x02,
                              0x11, 0x01, 0x03, 0x11, 0x01}));
    EXPECT_EQ(segs[9], (Bytes{0xFF, 0xDD, 0x00, 0x04, 0x00, 0x28}));
    EXPECT_EQ(segs[10], (Bytes{0xFF, 0xDA, 0x00, 0x0C, 0x03, 0x01, 0x00, 0x02, 0x11, 0x03, 0x11, 0x00, 0x3F, 0x00}));
    expect_turbo_header_plus_dri(colour, turbo_jpeg(rgb, 640, 480, 50, false), 40);

    const Bytes grey_rgb = photo_rgb(100, 100);
    const Bytes grey = rgb_to_grey(grey_rgb, 100, 100);
    const Bytes jg = encode_to_memory(image_info(grey.data(), 100, 100, EKO_FORMAT_GREY), 50);
    length = 0;
    for (const Bytes& s : header_segments(jg)) length += s.size();
    EXPECT_EQ(length, 334u);
    expect_turbo_header_plus_dri(jg, turbo_jpeg(grey_rgb, 100, 100, 50, true), 13);
}

TEST(Header, TablesEqualLibjpegTurbosAtEveryQuality) {
    const Bytes rgb = photo_rgb(16, 16);
    const Bytes grey = rgb_to_grey(rgb, 16, 16);
    for (uint32_t q = 0; q <= 102; ++q) {
        SCOPED_TRACE(q);
        const int turbo_q = q == 0 ? 1 : q > 100 ? 100 : static_cast<int>(q);  // 0 counts as 1, above 100 as 100
        expect_turbo_header_plus_dri(encode_to_memory(image_info(rgb.data(), 16, 16, EKO_FORMAT_RGB888), q),
                                     turbo_jpeg(rgb, 16, 16, turbo_q, false), 1);
        expect_turbo_header_plus_dri(encode_to_memory(image_info(grey.data(), 16, 16, EKO_FORMAT_GREY), q),
                                     turbo_jpeg(rgb, 16, 16, turbo_q, true), 2);
    }
    // Named rows, natural order: q75 luminance and chrominance, q49 luminance.
    struct Row {
        uint32_t quality;
        int table;
        std::array<int, 8> first_row;
    };
    const Row rows[] = {{75, 0, {8, 6, 5, 8, 12, 20, 26, 31}}, {75, 1, {9, 9, 12, 24, 50, 50, 50, 50}},
                        {49, 0, {16, 11, 10, 16, 24, 41, 52, 62}}};
    for (const Row& r : rows) {
        const Bytes j = encode_to_memory(image_info(rgb.data(), 16, 16, EKO_FORMAT_RGB888), r.quality);
        const Bytes dqt = header_segments(j)[2 + r.table];
        for (int k = 0; k < 64; ++k)
            if (kZigzag[k] < 8) {
                EXPECT_EQ(dqt[5 + k], r.first_row[kZigzag[k]]) << r.quality << " " << r.table;
            }
    }
}

TEST(Header, RestartIntervalIsOneMcuRow) {
    const Bytes row(49999 * 4, 0x33);
    const struct {
        uint32_t format;
        int width;
        uint16_t dri;
    } cases[] = {{EKO_FORMAT_YUV420, 49999, 3125}, {EKO_FORMAT_RGBA8888, 49999, 3125}, {EKO_FORMAT_GREY, 49999, 6250},
                 {EKO_FORMAT_RGB565, 17, 2},       {EKO_FORMAT_GREY, 17, 3},           {EKO_FORMAT_BGRA8888, 1, 1}};
    for (const auto& c : cases) {
        const std::vector<Bytes> segs = header_segments(encode_to_memory(image_info(row.data(), c.width, 1, c.format), 75));
        ASSERT_GE(segs.size(), 2u);
        EXPECT_EQ(segs[segs.size() - 2], (Bytes{0xFF, 0xDD, 0, 4, uint8_t(c.dri >> 8), uint8_t(c.dri)})) << c.width;
    }
}

TEST(Quantisation, ExportedLevelZeroIsAnnexKAndDivisorsFollowIt) {
    // libjpeg-turbo's quality-50 tables are the Annex K tables.
    const std::vector<Bytes> segs = header_segments(turbo_jpeg(photo_rgb(16, 16), 16, 16, 50, false));
    for (int k = 0; k < 64; ++k) {
        EXPECT_EQ(eko_luminanceQuantTbl[0][kZigzag[k]], segs[2][5 + k]) << k;
        EXPECT_EQ(eko_chrominanceQuantTbl[0][kZigzag[k]], segs[3][5 + k]) << k;
    }
    const struct {
        uint32_t quality;
        int index;
        uint32_t divisor;
    } cases[] = {{50, 0, 512}, {50, 1, 537}, {1, 0, 32}, {100, 0, 8192}, {100, 7, 32768}, {100, 55, 65536}, {100, 62, 65536}};
    for (const auto& c : cases) {
        Coder coder(8, 8, EKO_FORMAT_GREY, c.quality);
        EXPECT_EQ(coder.ctx->divisors[0][c.index], c.divisor) << c.quality << " " << c.index;
    }
}

TEST(ForwardDct, DefinedExamples) {
    std::array<std::array<uint8_t, 32>, 8> samples;
    uint8_t* rows[8];
    for (int y = 0; y < 8; ++y) rows[y] = samples[y].data();
    std::vector<uint32_t> divisors(64, 512);
    int16_t out[2][64];
    auto transform = [&](uint32_t start_col, uint32_t count, const uint32_t* d) {
        BlockPosition pos{0, start_col, count};
        std::memset(out, 0x5A, sizeof out);
        __eko_jpeg_enc_do_forward_dct(d, nullptr, rows, out[0], &pos);
        return pos.start_col;
    };
    // Uniform blocks and DC rounding: positive truncates, negative rounds.
    const struct {
        int fill, changed;
        int16_t dc;
    } dc_cases[] = {{128, 128, 0}, {255, 255, 63}, {0, 0, -64}, {128, 64, 0}, {128, 63, -1}, {128, 192, 0}, {128, 256 - 1, 0}};
    for (const auto& c : dc_cases) {
        for (auto& r : samples) r.fill(static_cast<uint8_t>(c.fill));
        samples[3][4] = static_cast<uint8_t>(c.changed);
        transform(0, 1, divisors.data());
        EXPECT_EQ(out[0][0], c.dc) << c.fill << " " << c.changed;
        for (int i = 1; i < 64 && c.fill == c.changed; ++i) EXPECT_EQ(out[0][i], 0) << c.fill;
    }
    // Two blocks from column 16: the second starts at column 24.
    for (auto& r : samples) {
        r.fill(128);
        std::fill(r.begin() + 16, r.begin() + 24, 255);
        std::fill(r.begin() + 24, r.end(), 0);
    }
    EXPECT_EQ(transform(16, 2, divisors.data()), 32u);
    EXPECT_EQ(out[0][0], 63);
    EXPECT_EQ(out[1][0], -64);
    EXPECT_EQ(transform(16, 0, divisors.data()), 16u);
    EXPECT_EQ(out[0][0], 0x5A5A);

}

TEST(Huffman, CodeTablesAndMagnitudeCategories) {
    Coder coder(16, 16, EKO_FORMAT_YUV420);
    const EntropyState* es = coder.ctx->entropy;
    const struct {
        const uint16_t* code;
        const uint8_t* size;
        int symbol, expected_code, expected_size;
    } cases[] = {{es->ac_codes[0]->code, es->ac_codes[0]->size, 0x00, 10, 4},  // EOB 1010
                 {es->ac_codes[0]->code, es->ac_codes[0]->size, 0xF0, 2041, 11},
                 {es->ac_codes[0]->code, es->ac_codes[0]->size, 0x01, 0, 2},
                 {es->ac_codes[0]->code, es->ac_codes[0]->size, 0x02, 1, 2},
                 {es->ac_codes[1]->code, es->ac_codes[1]->size, 0x00, 0, 2},
                 {es->ac_codes[1]->code, es->ac_codes[1]->size, 0xF0, 1018, 10},
                 {es->dc_codes[0]->code, es->dc_codes[0]->size, 0, 0, 2},
                 {es->dc_codes[0]->code, es->dc_codes[0]->size, 11, 510, 9},
                 {es->dc_codes[1]->code, es->dc_codes[1]->size, 11, 2046, 11}};
    for (const auto& c : cases) {
        EXPECT_EQ(c.size[c.symbol], c.expected_size) << c.symbol;
        EXPECT_EQ(c.code[c.symbol], c.expected_code) << c.symbol;
    }
    EXPECT_EQ(es->ac_codes[0]->size[0x0B], 0);  // a symbol without a code
    EXPECT_EQ(es->ac_codes[1]->size[0x0B], 0);
    for (uint32_t v = 0; v < 4096; ++v) ASSERT_EQ(coder.ctx->nbits_table[v], std::bit_width(v)) << v;
}

TEST(BitWriter, StuffingPaddingAndRestartStep) {
    Coder coder(24, 8, EKO_FORMAT_GREY);
    EncoderContext* ctx = coder.ctx;
    WorkingState ws{0, 0, {5, 6, 7}, ctx};
    __eko_jpeg_enc_write_bits(&ws, 0xFF, 8);      // FF, stuffed
    __eko_jpeg_enc_write_bits(&ws, 0x1234, 16);   // two bytes at once
    __eko_jpeg_enc_write_bits(&ws, 0xFD, 3);      // only the low bits: 101 waits
    EXPECT_EQ(coder.written(), (Bytes{0xFF, 0x00, 0x12, 0x34}));
    EXPECT_EQ(ws.put_bits, 3);

    // Restart step: nothing before the first MCU, then a marker where due,
    // after padding the waiting bits with ones; predictors back to 0.
    EXPECT_EQ(__eko_jpeg_write_restart_marker(nullptr, &ws), 0u);
    EXPECT_EQ(__eko_jpeg_write_restart_marker(ctx, nullptr), 0u);
    ASSERT_EQ(ctx->restart_interval, 3u);
    EXPECT_EQ(__eko_jpeg_write_restart_marker(ctx, &ws), 1u);
    EXPECT_EQ(ctx->restart_mcu_count, 1);
    EXPECT_EQ(coder.written().size(), 4u);
    ctx->restart_mcu_count = 3;
    EXPECT_EQ(__eko_jpeg_write_restart_marker(ctx, &ws), 1u);
    EXPECT_EQ(coder.written(4), (Bytes{0xBF, 0xFF, 0xD0}));
    EXPECT_EQ(ws.put_bits, 0);
    EXPECT_EQ(ws.last_dc_val[0], 0);
    EXPECT_EQ(ctx->restart_index, 1u);
    EXPECT_EQ(ctx->restart_mcu_count, 4);

    // Completion pads with ones: nothing waiting, 101 waiting, 1111111 waiting.
    const struct {
        uint32_t bits, size;
        Bytes tail;
    } pads[] = {{0, 0, {0xFF, 0xD9}}, {5, 3, {0xBF, 0xFF, 0xD9}}, {0x7F, 7, {0xFF, 0x00, 0xFF, 0xD9}}};
    for (const auto& p : pads) {
        Coder fresh(8, 8, EKO_FORMAT_GREY);
        WorkingState w{0, 0, {0, 0, 0}, fresh.ctx};
        __eko_jpeg_enc_write_bits(&w, p.bits, p.size);
        fresh.ctx->entropy->put_buffer = w.put_buffer;
        fresh.ctx->entropy->put_bits = w.put_bits;
        EXPECT_EQ(__eko_jpeg_enc_make_end_mark(fresh.ctx), 1u);
        EXPECT_EQ(fresh.written(), p.tail) << p.size;
        EXPECT_EQ(fresh.ctx->output->total, p.tail.size());
    }
}

TEST(BlockCoder, CoefficientsReadBackByLibjpeg) {
    // Random and extreme MCUs coded through the exported block coder, read
    // back as coefficients: position 63 comes back 0, AC values beyond the
    // baseline categories come back clamped to +-1023, every write stays
    // inside the target, and RST markers reset the predictors in step.
    const struct {
        uint32_t format;
        int w, h;
        uint32_t kind;
    } cases[] = {{EKO_FORMAT_GREY, 64, 64, EKO_OUTPUT_MEMORY}, {EKO_FORMAT_YUV420, 128, 96, EKO_OUTPUT_MEMORY},
                 {EKO_FORMAT_YUV420, 128, 64, EKO_OUTPUT_STREAM}};
    for (const auto& c : cases) {
        SCOPED_TRACE(c.w);
        const Bytes pixels(image_size(c.format, c.w, c.h), 0);
        const ImageInfo info = image_info(pixels.data(), c.w, c.h, c.format);
        const OutputRequest request{c.kind, nullptr, static_cast<uint8_t*>(DORVATEKO_OsMalloc(2048)), 2048};
        const EncodeOptions options{75, nullptr, 0};
        EncoderContext* ctx = __eko_jpeg_enc_initiaize(&info, &request, &options, nullptr);
        ASSERT_NE(ctx, nullptr);
        Bytes streamed;
        ctx->output->callback = [](void* arg, const uint8_t* d, uint32_t n) {
            static_cast<Bytes*>(arg)->insert(static_cast<Bytes*>(arg)->end(), d, d + n);
            return n;
        };
        ctx->output->callback_arg = &streamed;
        if (c.kind != EKO_OUTPUT_MEMORY) DORVATEKO_OsFree(request.buffer);
        ASSERT_EQ(__eko_jpeg_enc_make_header(ctx), 1u);
        std::mt19937 rng(c.w);
        std::vector<std::array<int16_t, 64>> sent;  // in MCU order, as expected back
        const uint32_t mcus = ctx->mcus_per_row * ctx->total_imcu_rows;
        for (uint32_t m = 0; m < mcus; ++m) {
            int16_t* const* blocks = ctx->mcu_state->mcu_buffer;
            for (uint32_t b = 0; b < ctx->blocks_in_mcu; ++b) {
                std::array<int16_t, 64> expect{};
                // Every third MCU is all worst-case blocks: the longest codes
                // with all-ones extra bits, the most stuffed FF bytes.
                const int style = m % 3 == 0 ? 1 : static_cast<int>((m + b) % 4);
                for (int k = 0; k < 64; ++k) {
                    int v = 0;
                    if (style == 0) v = (k % 2 ? 1 : -1) * (2000 + k);  // beyond category 10
                    if (style == 1) v = 1023;
                    if (style == 2 && rng() % 6 == 0) v = static_cast<int>(rng() % 201) - 100;
                    if (style == 3 && (k == 21 || k == 63)) v = -1;     // a run of 20, then the last position
                    if (k == 0) v = static_cast<int>(rng() % 2041) - 1024;
                    blocks[b][kZigzag[k]] = static_cast<int16_t>(v);
                    expect[kZigzag[k]] = static_cast<int16_t>(k == 63 ? 0 : k == 0 ? v : std::clamp(v, -1023, 1023));
                }
                sent.push_back(expect);
            }
            ASSERT_EQ(__eko_jpeg_enc_encode_1mcu_blk(ctx, blocks), 1u);
            ASSERT_LE(ctx->output->used, ctx->output->capacity);
            for (uint32_t b = 0; b < ctx->blocks_in_mcu; ++b) EXPECT_EQ(blocks[b][63], 0);
        }
        ASSERT_EQ(__eko_jpeg_enc_make_end_mark(ctx), 1u);
        const int mcu_cols = static_cast<int>(ctx->mcus_per_row);
        Bytes jpeg = c.kind == EKO_OUTPUT_MEMORY ? Bytes(ctx->output->buffer, ctx->output->buffer + ctx->output->total) : streamed;
        if (c.kind == EKO_OUTPUT_MEMORY) DORVATEKO_OsFree(ctx->output->buffer);
        __eko_jpeg_enc_release_mem(ctx);
        DORVATEKO_OsFree(ctx);

        Coefficients got;
        read_coefficients(jpeg, got);
        ASSERT_TRUE(got.ok);
        EXPECT_EQ(got.warnings, 0);
        // Back to MCU order: Y blocks TL, TR, BL, BR (or the one grey block), Cb, Cr.
        size_t n = 0;
        for (uint32_t m = 0; m < mcus; ++m) {
            const int mx = static_cast<int>(m) % mcu_cols, my = static_cast<int>(m) / mcu_cols;
            std::vector<const std::array<int16_t, 64>*> order;
            if (c.format == EKO_FORMAT_GREY) {
                order.push_back(&got.blocks[0][size_t(my * got.cols[0] + mx)]);
            } else {
                for (int r = 0; r < 2; ++r)
                    for (int q = 0; q < 2; ++q) order.push_back(&got.blocks[0][size_t((2 * my + r) * got.cols[0] + 2 * mx + q)]);
                for (int comp = 1; comp < 3; ++comp) order.push_back(&got.blocks[comp][size_t(my * got.cols[comp] + mx)]);
            }
            for (const auto* blk : order) ASSERT_EQ(*blk, sent[n++]) << "MCU " << m;
        }
    }
}

TEST(BlockCoder, RestartMarkersFollowEachMcuRowInSequence) {
    const struct {
        uint32_t format;
        int w, h;
        std::vector<uint8_t> markers;
    } cases[] = {{EKO_FORMAT_YUV420, 32, 160, {0xD0, 0xD1, 0xD2, 0xD3, 0xD4, 0xD5, 0xD6, 0xD7, 0xD0}},
                 {EKO_FORMAT_GREY, 24, 24, {0xD0, 0xD1}},
                 {EKO_FORMAT_RGB888, 17, 17, {0xD0}},
                 {EKO_FORMAT_GREY, 100, 8, {}}};
    for (const auto& c : cases) {
        const Bytes px = rgb_to_format(photo_rgb(c.w, c.h, 4), c.w, c.h, c.format);
        const Bytes j = encode_to_memory(image_info(px.data(), c.w, c.h, c.format), 100);
        size_t start = 0;
        for (const Bytes& s : header_segments(j)) start += s.size();
        std::vector<uint8_t> found;
        for (size_t i = start; i + 1 < j.size(); ++i)
            if (j[i] == 0xFF && j[i + 1] != 0x00) found.push_back(j[++i]);
        ASSERT_FALSE(found.empty());
        EXPECT_EQ(found.back(), 0xD9);
        found.pop_back();
        EXPECT_EQ(found, c.markers) << c.w << "x" << c.h;
    }
}

TEST(BandDriver, BlocksOutsideTheImageAreDummiesRepeatingTheDcBeforeThem) {
    // 4:2:0 luma blocks beyond the image: a right-edge dummy repeats its left
    // neighbour's DC, a bottom row repeats the DC of the MCU's block before it.
    const int sizes[][2] = {{17, 20}, {33, 17}, {1, 1}, {8, 40}};
    for (const auto& s : sizes) {
        SCOPED_TRACE(std::to_string(s[0]) + "x" + std::to_string(s[1]));
        const Bytes px = rgb_to_format(photo_rgb(s[0], s[1], 6), s[0], s[1], EKO_FORMAT_YUV420);
        Coefficients got;
        read_coefficients(encode_to_memory(image_info(px.data(), s[0], s[1], EKO_FORMAT_YUV420), 90), got);
        ASSERT_TRUE(got.ok);
        const int wb = (s[0] + 7) / 8, hb = (s[1] + 7) / 8, cols = got.cols[0];
        auto at = [&](int r, int q) { return got.blocks[0][size_t(r * cols + q)]; };
        for (int r = 0; r < static_cast<int>(got.blocks[0].size()) / cols; ++r)
            for (int q = 0; q < cols; ++q) {
                if (r < hb && q < wb) continue;
                const auto b = at(r, q);
                for (int i = 1; i < 64; ++i) ASSERT_EQ(b[i], 0) << r << "," << q;
                const int16_t dc = r >= hb && r % 2 ? at(r - 1, q | 1)[0] : at(r, q - 1)[0];
                EXPECT_EQ(b[0], dc) << r << "," << q;
            }
    }
}
