// Refused calls: null arguments, bad formats and dimensions, output kinds and
// EncoderSettings records that cannot be served. Each returns 0 (or null),
// reports its code (kept per thread), leaks no block and leaves no file open.
#include <TekoJEncoderInternal.h>

#include "support/test_support.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <functional>
#include <string>
#include <thread>

using namespace tekoj_test;

namespace {

uint32_t ignore(void*, const uint8_t*, uint32_t) { return 1; }

// Runs a refused call and checks what every refusal shares.
void expect_refused(const std::function<uint32_t()>& call, uint32_t error) {
    NoLeak no_leak;
    eko_SetError(99);  // a stale reason the refusal must replace with its own
    EXPECT_EQ(call(), 0u);
    EXPECT_EQ(eko_GetLastError(), error);
}

// Refused by every whole-image member, the caller's block kept and no file
// written. Null pixels are refused before anything else: before a named
// file is opened or a short block enlarged (so from 100 bytes, not 4096).
void expect_refused_by_every_member(const ImageInfo& info, uint32_t error) {
    const std::string name = temp_path("misuse.jpg");
    const bool first = info.data == nullptr;
    for (int m = 0; m < kMembers; ++m) {
        SCOPED_TRACE(member_name(m));
        expect_refused([&] {
            const Call c = call_member(m, info, 75, name, first ? 100 : 4096);
            EXPECT_TRUE(c.kept);
            return c.result;
        }, error);
        EXPECT_TRUE(first && m != kToFileFull && m != kToFileExFull ? !file_exists(name) : read_file(name).empty());
        std::remove(name.c_str());
    }
}

uint8_t g_mark;

// eko_enc_jpeg_to_buffer (or _ex) on the caller's variables holding a block of
// `length` bytes (a mark if not positive): a refused call leaves both as they
// were, and the block the caller's.
std::function<uint32_t()> on_block(bool ex, const ImageInfo* info, const EncodeOptions* options, int32_t length) {
    return [=] {
        uint8_t* const block = length > 0 ? static_cast<uint8_t*>(DORVATEKO_OsMalloc(length)) : &g_mark;
        uint8_t* buffer = block;
        int32_t len = length;
        const uint32_t r = ex ? eko_enc_jpeg_to_buffer_ex(info, &buffer, &len, options)
                              : eko_enc_jpeg_to_buffer(info, &buffer, &len, 75);
        EXPECT_TRUE(buffer == block && len == length);
        if (block != &g_mark) DORVATEKO_OsFree(block);
        return r;
    };
}

}  // namespace

TEST(Misuse, NullArgumentsAndUnusableTargetsAreRefused) {
    const Bytes px = rgb_to_format(photo_rgb(32, 24), 32, 24, EKO_FORMAT_RGB888);
    const ImageInfo good = image_info(px.data(), 32, 24, EKO_FORMAT_RGB888);
    const EncodeOptions opts{75, nullptr, 0};
    const std::string name = temp_path("misuse.jpg");
    int arg = 0;
    int32_t length = 4096;
    uint8_t* buffer = nullptr;
    const struct { const char* what; std::function<uint32_t()> call; uint32_t error; } rows[] = {
        {"file, null image", [&] { return eko_enc_jpeg_to_file(nullptr, name.c_str(), 75); }, EKO_ERR_ARGUMENT},
        {"file, null name", [&] { return eko_enc_jpeg_to_file(&good, nullptr, 75); }, EKO_ERR_ARGUMENT},
        {"file_ex, null options", [&] { return eko_enc_jpeg_to_file_ex(&good, name.c_str(), nullptr); }, EKO_ERR_ARGUMENT},
        {"file_ex, unopenable path", [&] { return eko_enc_jpeg_to_file_ex(&good, "/nonexistent/x.jpg", &opts); }, EKO_ERR_OPEN},
        {"file full buffer, no handle", [&] { OutputRequest r{}; return eko_enc_jpeg_to_file_full_buffer(&good, &r, 75); }, EKO_ERR_ARGUMENT},
        {"buffer, null buffer variable", [&] { return eko_enc_jpeg_to_buffer(&good, nullptr, &length, 75); }, EKO_ERR_ARGUMENT},
        {"buffer, null length variable", [&] { return eko_enc_jpeg_to_buffer(&good, &buffer, nullptr, 75); }, EKO_ERR_ARGUMENT},
        {"buffer, negative length", on_block(false, &good, &opts, -1), EKO_ERR_ARGUMENT},
        {"buffer_ex, negative length", on_block(true, &good, &opts, -4096), EKO_ERR_ARGUMENT},
        {"buffer, null image", on_block(false, nullptr, &opts, 100), EKO_ERR_ARGUMENT},
        {"buffer_ex, null options", on_block(true, &good, nullptr, 4096), EKO_ERR_ARGUMENT},
        {"buffer full buffer, null request", [&] { return eko_enc_jpeg_to_buffer_full_buffer(&good, nullptr, 75); }, EKO_ERR_ARGUMENT},
        {"buffer full buffer, null options leave the request alone (a change counts as success)", [&] {
             OutputRequest r{7, nullptr, &g_mark, 12345};
             return eko_enc_jpeg_to_buffer_ex_full_buffer(&good, &r, nullptr) + (r.buffer != &g_mark || r.capacity != 12345);
         }, EKO_ERR_ARGUMENT},
        {"stream, null callback", [&] { return eko_enc_jpeg_to_stream(&good, nullptr, 75, &arg); }, EKO_ERR_ARGUMENT},
        {"stream, null callback argument", [&] { return eko_enc_jpeg_to_stream(&good, ignore, 75, nullptr); }, EKO_ERR_ARGUMENT},
        {"stream_ex, null options", [&] { return eko_enc_jpeg_to_stream_ex(&good, ignore, nullptr, &arg); }, EKO_ERR_ARGUMENT},
        {"EXIF block into no buffer", [&] { ExifInfo e{}; return __eko_CreateExif(nullptr, &e); }, EKO_ERR_ARGUMENT},
    };
    for (const auto& row : rows) {
        SCOPED_TRACE(row.what);
        expect_refused(row.call, row.error);
    }
    // Null pixels, in every layout, through every member.
    for (uint32_t format : {0u, 1u, 2u, 4u, 7u, 8u}) {
        SCOPED_TRACE("format " + std::to_string(format));
        expect_refused_by_every_member(image_info(nullptr, 32, 24, format), EKO_ERR_ARGUMENT);
    }
    uint8_t block[4096];
    for (uint32_t kind : {2u, 3u, 5u, 8u, 0xFFFFFFFFu}) {  // creation refuses other output kinds
        const OutputRequest request{kind, nullptr, block, sizeof block};
        expect_refused([&] { return __eko_jpeg_enc_initiaize(&good, &request, &opts, nullptr) ? 1u : 0u; }, EKO_ERR_ARGUMENT);
    }
}

TEST(Misuse, BadFormatsAndDimensionsAreRefusedByEveryOutputKind) {
    const Bytes px(64 * 64 * 4, 0x40);
    const struct { uint32_t format; int w, h; uint32_t error; } bad[] = {
        {3, 32, 24, EKO_ERR_FORMAT},        {5, 32, 24, EKO_ERR_FORMAT},     {0x203, 32, 24, EKO_ERR_FORMAT},
        {6, -1, 50000, EKO_ERR_FORMAT},     {1, 0, 24, EKO_ERR_DIMENSIONS},  {2, 50000, 24, EKO_ERR_DIMENSIONS},
        {4, 32, -1, EKO_ERR_DIMENSIONS},    {7, 32, 50000, EKO_ERR_DIMENSIONS}, {8, INT32_MIN, 1, EKO_ERR_DIMENSIONS}};
    for (const auto& d : bad) {
        SCOPED_TRACE("format " + std::to_string(d.format) + " " + std::to_string(d.w) + "x" + std::to_string(d.h));
        expect_refused_by_every_member(image_info(px.data(), d.w, d.h, d.format), d.error);
    }
    // The last code is kept per thread: another thread's 6 beside this one's 14.
    uint32_t other = 0;
    std::thread([&] {
        const ImageInfo info = image_info(px.data(), 8, 8, 3);
        EXPECT_EQ(eko_enc_jpeg_to_stream(&info, ignore, 75, &other), 0u);
        other = eko_GetLastError();
    }).join();
    EXPECT_EQ(other, uint32_t(EKO_ERR_FORMAT));
    EXPECT_EQ(eko_GetLastError(), uint32_t(EKO_ERR_DIMENSIONS));
    // Only the format word's low byte counts.
    EXPECT_EQ(encode_to_memory(image_info(px.data(), 20, 15, 0x7F00 | EKO_FORMAT_GREY), 75),
              encode_to_memory(image_info(px.data(), 20, 15, EKO_FORMAT_GREY), 75));
}

TEST(Creation, RefusesSettingsThatTheGeometryCannotServe) {
    const struct { const char* what; uint32_t format; void (*change)(EncoderSettings&); } rows[] = {
        {"no component", EKO_FORMAT_YUV420, [](EncoderSettings& s) { s.num_components = 0; }},
        {"two components", EKO_FORMAT_YUV420, [](EncoderSettings& s) { s.num_components = 2; }},
        {"horizontal factor 0", EKO_FORMAT_YUV420, [](EncoderSettings& s) { s.component_specs[1][1] = 0; }},
        {"vertical factor 0", EKO_FORMAT_YUV420, [](EncoderSettings& s) { s.component_specs[2][2] = 0; }},
        // Its header carries table 0 alone: a frame naming table 1 would not decode.
        {"one component naming table 1 of 2", EKO_FORMAT_YUV420,
         [](EncoderSettings& s) { s.num_components = 1, s.component_specs[0][0] = 1; }},
        {"factor 3", EKO_FORMAT_YUV420, [](EncoderSettings& s) { s.component_specs[0][1] = 3; }},
        {"12 blocks per MCU", EKO_FORMAT_YUV420,
         [](EncoderSettings& s) { for (int c : {1, 2}) s.component_specs[c][1] = s.component_specs[c][2] = 2; }},
        {"five tables", EKO_FORMAT_YUV420, [](EncoderSettings& s) { s.num_quant_tables = 5; }},
        {"a component naming table 2 of 2", EKO_FORMAT_YUV420, [](EncoderSettings& s) { s.component_specs[2][0] = 2; }},
        {"a table entry of 0", EKO_FORMAT_YUV420, [](EncoderSettings& s) { s.quant_tables[1][17] = 0; }},
        {"grey with three components", EKO_FORMAT_GREY, [](EncoderSettings&) {}},
        {"RGB888 with one component", EKO_FORMAT_RGB888, [](EncoderSettings& s) { s.num_components = 1; }},
        {"RGBA8888 with chroma 2x1", EKO_FORMAT_RGBA8888, [](EncoderSettings& s) { s.component_specs[2][1] = 2; }},
    };
    const Bytes px(48 * 40 * 4, 0x66);
    for (const auto& row : rows) {
        SCOPED_TRACE(row.what);
        const ImageInfo info = image_info(px.data(), 48, 40, row.format);
        EncoderSettings s = settings(0, 1, 2, 2, 50);
        // The unchanged record is accepted.
        if (row.format != EKO_FORMAT_GREY) { EXPECT_TRUE(decode_jpeg(encode_in_steps(info, &s)).ok); }
        row.change(s);
        expect_refused([&] { return encode_in_steps(info, &s).empty() ? 0u : 1u; }, EKO_ERR_SAMPLING);
    }
}

TEST(Creation, SettingsForOneComponentOrWithoutDriAreFollowed) {
    // One component is coded 1x1 whatever the record said; format 2 then
    // codes its Y plane alone, exactly as grey.
    const Bytes rgb = photo_rgb(37, 48, 4);
    const Bytes grey = rgb_to_grey(rgb, 37, 48), yuv = rgb_to_yuv420(rgb, 37, 48);
    EncoderSettings s = settings(0, 1, 2, 2, 50);
    s.num_components = 1;
    const Bytes reference = encode_in_steps(image_info(grey.data(), 37, 48, EKO_FORMAT_GREY), &s);
    EXPECT_TRUE(decode_jpeg(reference).ok && !decode_jpeg(reference).warning);
    for (uint8_t f : {1, 2}) {
        for (uint32_t format : {EKO_FORMAT_GREY, EKO_FORMAT_YUV420}) {
            SCOPED_TRACE(std::to_string(f) + "x" + std::to_string(f) + " format " + std::to_string(format));
            s.component_specs[0][1] = s.component_specs[0][2] = f;
            const uint8_t* data = format == EKO_FORMAT_GREY ? grey.data() : yuv.data();
            const Bytes jpeg = encode_in_steps(image_info(data, 37, 48, format), &s);
            const size_t sof = find_marker(jpeg, 0xC0);
            ASSERT_LT(sof + 11, jpeg.size());
            EXPECT_TRUE(jpeg[sof + 9] == 1 && jpeg[sof + 11] == 0x11);  // one component, 1x1
            EXPECT_EQ(jpeg, reference);
        }
    }
    // Four tables, the chroma components naming tables 2 and 3.
    s = settings(0, 1, 2, 2, 50);
    s.num_quant_tables = 4, s.component_specs[1][0] = 2, s.component_specs[2][0] = 3;
    std::memcpy(s.quant_tables[2], eko_chrominanceQuantTbl[3], 64);
    std::memcpy(s.quant_tables[3], eko_chrominanceQuantTbl[6], 64);
    const Bytes four = encode_in_steps(image_info(yuv.data(), 37, 48, EKO_FORMAT_YUV420), &s);
    EXPECT_TRUE(decode_jpeg(four).ok && !decode_jpeg(four).warning && find_marker(four, 0xDB) < four.size());
    // write_dri 0: neither a DRI segment nor restart markers.
    const ImageInfo colour = image_info(yuv.data(), 37, 48, EKO_FORMAT_YUV420);
    s = settings(0, 1, 2, 2, 50);
    s.write_dri = 0;
    const Bytes jpeg = encode_in_steps(colour, &s);
    for (uint8_t code : {0xDD, 0xD0, 0xD1, 0xD2, 0xD7}) EXPECT_EQ(find_marker(jpeg, code), jpeg.size()) << int(code);
    EXPECT_FALSE(decode_jpeg(jpeg).warning);
}

TEST(Creation, PlaneOffsetsOfTheLargestImageDoNotOverflow) {
    // 49999 x 49999 passes 2^31 bytes; creation only places the plane pointers.
    static const uint8_t anchor[1] = {0};
    const ImageInfo info = image_info(anchor, 49999, 49999, EKO_FORMAT_YUV420);
    Context c(info);
    ASSERT_NE(c.ctx, nullptr);
    EXPECT_EQ(uintptr_t(c->plane_u) - uintptr_t(anchor), uintptr_t{49999} * 49999);
    EXPECT_EQ(uintptr_t(c->plane_v) - uintptr_t(anchor), uintptr_t{49999} * 49999 + uintptr_t{25000} * 25000);
}

TEST(ErrorCode, EveryCallThatSucceedsReportsNoError) {
    // The reason always belongs to the last call: a success after a failure
    // reads 0, not the failure's code.
    const auto fresh = [](const std::string& what, bool succeeded) {
        EXPECT_TRUE(succeeded && eko_GetLastError() == EKO_OK) << what;
        eko_SetError(EKO_ERR_STATE);  // stale for the next call
    };
    const Bytes yuv = rgb_to_yuv420(photo_rgb(32, 32), 32, 32);
    const ImageInfo info = image_info(yuv.data(), 32, 32, EKO_FORMAT_YUV420);
    const std::string path = temp_path("fresh.jpg");
    eko_SetError(EKO_ERR_STATE);
    for (int m = 0; m < kMembers; ++m) fresh(member_name(m), call_member(m, info, 75, path).result == 1);
    std::remove(path.c_str());
    // Incremental: a band, a row of coefficients, columns and the join.
    const EncoderSettings s = settings(0, 1, 2, 2, 50);
    const EncodeOptions options{75, nullptr, 0};
    std::vector<int16_t> zero(12 * 64, 0);
    McuBlockList mcus[2];
    for (int k = 0; k < 12; ++k) mcus[k / 6].blocks[k % 6] = &zero[64 * k];
    uint8_t* block = nullptr;
    uint32_t length = 0, next = 0;
    for (const bool columns : {false, true}) {
        const OutputRequest request{EKO_OUTPUT_MEMORY, nullptr, nullptr, 0};
        EncoderContext* ctx = eko_jpeg_enc_mcu_init(&info, &request, &options, &s);
        fresh("init", ctx != nullptr);
        fresh("get_encdata", eko_jpeg_enc_mcu__get_encdata(ctx, &block, &length) != nullptr);
        if (columns) {
            fresh("column set-up", __eko_jpeg_enc_col_encoder_init(ctx) == 1);
            McuBlockList column[2] = {mcus[0], mcus[1]};
            for (int k = 0; k < 2; ++k) fresh("column", __eko_jpeg_enc_col_entroy_encoder(ctx, column, &next) == 1);
            fresh("join", __eko_jpeg_enc_col_encoder_finish(ctx) == 1);
        } else {
            fresh("band", eko_jpeg_enc_muc_process(ctx, yuv.data(), &next) == 1);
            fresh("row driver", __eko_jpeg_enc_entroy_encoder(ctx, mcus, &next) == 1);
        }
        eko_jpeg_enc_mcu_finish(ctx, &block, &length);
        fresh("finish", block != nullptr);
        DORVATEKO_OsFree(block);
    }
    const OutputRequest to_stream{EKO_OUTPUT_STREAM, nullptr, nullptr, 0};
    EncoderContext* ctx = eko_jpeg_enc_mcu_init(&info, &to_stream, &options, nullptr);
    fresh("set_stream", eko_jpeg_enc_mcu_set_stream(ctx, ignore, nullptr) == 1);
    eko_jpeg_enc_mcu_finish(ctx, nullptr, nullptr);
    // Conversions, the packed reader and the EXIF builder.
    std::vector<uint16_t> rgb565(32 * 32);
    fresh("RGB565", eko_DuoYUV420toRGB565(yuv.data(), 32, 32, rgb565.data()) == 1);
    fresh("RGB565 from V/U", eko_DuoPYV0420toRGB565(yuv.data(), 32, 32, rgb565.data()) == 1);
    Bytes scaled(16 * 8 * 3 / 2);
    __eko_jpeg_enc_down_scale_yuv422(yuv.data(), 16, 16, 16, scaled.data(), 16, 8);
    fresh("down-scaler", true);
    const OutputRequest to_memory{EKO_OUTPUT_MEMORY, nullptr, nullptr, 0};
    ctx = __eko_jpeg_enc_initiaize(&info, &to_memory, &options, nullptr);
    fresh("creation", ctx != nullptr);
    fresh("packed 4:2:2 reader", __eko_jpeg_enc_get_raw_duoview422_data(ctx) == 1);
    __eko_jpeg_enc_release_mem(ctx);
    DORVATEKO_OsFree(ctx);
    uint8_t tiff[64];
    const ExifInfo none{};
    fresh("EXIF block", __eko_CreateExif(tiff, &none) == 44);
}
