// Refused calls: null arguments, bad formats and dimensions, output kinds and
// EncoderSettings records that cannot be served. Each returns 0 (or null),
// reports its code, leaks no block and leaves no file open.
#include <TekoJEncoder.h>

#include "support/fault_os_layer.h"
#include "support/test_support.h"

#include <gtest/gtest.h>

#include <cstring>
#include <filesystem>
#include <functional>
#include <string>
#include <thread>

using namespace tekoj_test;

namespace {

size_t open_descriptors() {
    size_t n = 0;
    for ([[maybe_unused]] const auto& e : std::filesystem::directory_iterator("/proc/self/fd")) ++n;
    return n;
}

uint32_t ignore(void*, const uint8_t*, uint32_t) { return 1; }

// Runs a refused call and checks what every refusal shares.
void expect_refused(const std::function<uint32_t()>& call, uint32_t error, bool allocation_free = false) {
    FaultScope scope;
    const int64_t live = live_blocks();
    const size_t fds = open_descriptors();
    eko_SetError(EKO_OK);
    EXPECT_EQ(call(), 0u);
    if (error != EKO_OK) {
        EXPECT_EQ(eko_GetLastError(), error);
    }
    if (allocation_free) {
        EXPECT_EQ(allocation_count(), 0);
    }
    EXPECT_EQ(live_blocks(), live);
    EXPECT_EQ(open_descriptors(), fds);
}

// A whole encode through the exported steps, with an EncoderSettings record;
// empty when creation refuses it.
Bytes encode_with_settings(const ImageInfo& info, const EncoderSettings* settings, uint32_t quality = 75) {
    const OutputRequest request{EKO_OUTPUT_MEMORY, nullptr, nullptr, 0};
    const EncodeOptions options{quality, nullptr, 0};
    EncoderContext* ctx = __eko_jpeg_enc_initiaize(&info, &request, &options, settings);
    if (ctx == nullptr) return {};
    EXPECT_EQ(__eko_jpeg_enc_make_header(ctx), 1u);
    while (ctx->next_row < static_cast<uint32_t>(ctx->height)) {
        EXPECT_EQ(__eko_jpeg_enc_process_image_data(ctx), 1u);
        ctx->next_row = static_cast<uint16_t>(ctx->next_row + ctx->max_v_samp * 8);
    }
    EXPECT_EQ(__eko_jpeg_enc_make_end_mark(ctx), 1u);
    Bytes out(ctx->output->buffer, ctx->output->buffer + ctx->output->total);
    DORVATEKO_OsFree(ctx->output->buffer);
    __eko_jpeg_enc_release_mem(ctx);
    DORVATEKO_OsFree(ctx);
    return out;
}

EncoderSettings settings_420() {
    EncoderSettings s{};
    s.num_components = 3;
    s.num_quant_tables = 2;
    std::memcpy(s.quant_tables[0], eko_luminanceQuantTbl[0], 64);
    std::memcpy(s.quant_tables[1], eko_chrominanceQuantTbl[0], 64);
    s.write_dri = 1;
    const uint8_t specs[3][3] = {{0, 2, 2}, {1, 1, 1}, {1, 1, 1}};
    std::memcpy(s.component_specs, specs, sizeof specs);
    return s;
}

// Index of the marker FF code in a stream's header, or npos.
size_t find_marker(const Bytes& jpeg, uint8_t code) {
    for (size_t i = 0; i + 1 < jpeg.size(); ++i)
        if (jpeg[i] == 0xFF && jpeg[i + 1] == code) return i;
    return std::string::npos;
}

}  // namespace

TEST(Misuse, NullArgumentsAndUnusableTargetsAreRefused) {
    const Bytes px = rgb_to_format(photo_rgb(32, 24), 32, 24, EKO_FORMAT_RGB888);
    const ImageInfo good = image_info(px.data(), 32, 24, EKO_FORMAT_RGB888);
    const EncodeOptions opts{75, nullptr, 0};
    const std::string path = temp_path("misuse.jpg");
    const char* const name = path.c_str();
    int arg = 0;
    uint8_t* const mark = reinterpret_cast<uint8_t*>(&arg);
    // Memory calls: `expect_null` after a failed creation (the block stays the
    // caller's), otherwise the caller's variables unchanged.
    auto memory = [&](int32_t length, bool expect_null, auto call) {
        return [=] {
            uint8_t* const block = length > 0 ? static_cast<uint8_t*>(DORVATEKO_OsMalloc(length)) : mark;
            uint8_t* buffer = block;
            int32_t len = length;
            const uint32_t r = call(&buffer, &len);
            EXPECT_EQ(buffer, expect_null ? nullptr : block);
            EXPECT_EQ(len, expect_null ? 0 : length);
            if (block != mark) DORVATEKO_OsFree(block);
            return r;
        };
    };
    auto file_request = [&](const EncodeOptions* o) {
        return [=] {
            OutputRequest r{EKO_OUTPUT_FILE, DORVATEKO_OsFopen(name, "wb"), nullptr, 0};
            return eko_enc_jpeg_to_file_ex_full_buffer(&good, &r, o);  // closes the handle even so
        };
    };
    struct Row {
        const char* what;
        std::function<uint32_t()> call;
        uint32_t error;
        bool allocation_free;
    };
    const Row rows[] = {
        {"file, null image", [&] { return eko_enc_jpeg_to_file(nullptr, name, 75); }, EKO_ERR_ARGUMENT, false},
        {"file, null name", [&] { return eko_enc_jpeg_to_file(&good, nullptr, 75); }, EKO_OK, true},
        {"file_ex, null options", [&] { return eko_enc_jpeg_to_file_ex(&good, name, nullptr); }, EKO_ERR_ARGUMENT, false},
        {"file_ex, unopenable path", [&] { return eko_enc_jpeg_to_file_ex(&good, "/nonexistent/x.jpg", &opts); }, EKO_OK, true},
        {"file full buffer, null request", [&] { return eko_enc_jpeg_to_file_full_buffer(&good, nullptr, 75); }, EKO_OK, true},
        {"file full buffer, null options", file_request(nullptr), EKO_ERR_ARGUMENT, false},
        {"buffer, null buffer variable", [&] {
             int32_t length = 4096;
             return eko_enc_jpeg_to_buffer(&good, nullptr, &length, 75);
         }, EKO_OK, true},
        {"buffer, null length variable", [&] {
             uint8_t* buffer = nullptr;
             return eko_enc_jpeg_to_buffer(&good, &buffer, nullptr, 75);
         }, EKO_OK, true},
        {"buffer, negative length", memory(-1, false, [&](uint8_t** b, int32_t* l) { return eko_enc_jpeg_to_buffer(&good, b, l, 75); }), EKO_OK, true},
        {"buffer_ex, negative length", memory(-4096, true, [&](uint8_t** b, int32_t* l) { return eko_enc_jpeg_to_buffer_ex(&good, b, l, &opts); }), EKO_OK, true},
        {"buffer, null image", memory(4096, true, [&](uint8_t** b, int32_t* l) { return eko_enc_jpeg_to_buffer(nullptr, b, l, 75); }), EKO_OK, false},
        {"buffer_ex, null options", memory(4096, true, [&](uint8_t** b, int32_t* l) { return eko_enc_jpeg_to_buffer_ex(&good, b, l, nullptr); }), EKO_ERR_ARGUMENT, false},
        {"buffer full buffer, null request", [&] { return eko_enc_jpeg_to_buffer_full_buffer(&good, nullptr, 75); }, EKO_OK, true},
        {"buffer full buffer, null options leave the request alone", [&] {
             OutputRequest r{7, nullptr, mark, 12345};
             const uint32_t result = eko_enc_jpeg_to_buffer_ex_full_buffer(&good, &r, nullptr);
             EXPECT_TRUE(r.buffer == mark && r.capacity == 12345u);
             return result;
         }, EKO_ERR_ARGUMENT, false},
        {"stream, null callback", [&] { return eko_enc_jpeg_to_stream(&good, nullptr, 75, &arg); }, EKO_OK, true},
        {"stream, null callback argument", [&] { return eko_enc_jpeg_to_stream(&good, ignore, 75, nullptr); }, EKO_OK, true},
        {"stream_ex, null callback", [&] { return eko_enc_jpeg_to_stream_ex(&good, nullptr, &opts, &arg); }, EKO_OK, true},
        {"stream_ex, null options", [&] { return eko_enc_jpeg_to_stream_ex(&good, ignore, nullptr, &arg); }, EKO_ERR_ARGUMENT, false},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.what);
        expect_refused(row.call, row.error, row.allocation_free);
    }
    std::remove(name);
}

TEST(Misuse, BadFormatsAndDimensionsAreRefusedByEveryOutputKind) {
    const Bytes px(64 * 64 * 4, 0x40);
    struct Description {
        uint32_t format;
        int w, h;
        uint32_t error;
    };
    const Description bad[] = {
        {3, 32, 24, EKO_ERR_FORMAT},       {5, 32, 24, EKO_ERR_FORMAT},       {6, 32, 24, EKO_ERR_FORMAT},
        {9, 32, 24, EKO_ERR_FORMAT},       {255, 32, 24, EKO_ERR_FORMAT},     {0x203, 32, 24, EKO_ERR_FORMAT},
        {3, 0, 0, EKO_ERR_FORMAT},         {6, -1, 50000, EKO_ERR_FORMAT},    {1, 0, 24, EKO_ERR_DIMENSIONS},
        {1, -1, 24, EKO_ERR_DIMENSIONS},   {2, 50000, 24, EKO_ERR_DIMENSIONS}, {4, 32, 0, EKO_ERR_DIMENSIONS},
        {4, 32, -1, EKO_ERR_DIMENSIONS},   {7, 32, 50000, EKO_ERR_DIMENSIONS}, {8, INT32_MIN, 1, EKO_ERR_DIMENSIONS},
    };
    const EncodeOptions options{75, nullptr, 0};
    const std::string path = temp_path("bad.jpg");
    for (const Description& d : bad) {
        const ImageInfo info = image_info(px.data(), d.w, d.h, d.format);
        SCOPED_TRACE("format " + std::to_string(d.format) + " " + std::to_string(d.w) + "x" + std::to_string(d.h));
        expect_refused([&] {
            uint8_t* const block = static_cast<uint8_t*>(DORVATEKO_OsMalloc(4096));
            uint8_t* buffer = block;
            int32_t length = 4096;
            const uint32_t r = eko_enc_jpeg_to_buffer_ex(&info, &buffer, &length, &options);
            EXPECT_EQ(buffer, nullptr);
            EXPECT_EQ(length, 0);
            DORVATEKO_OsFree(block);  // not freed by the refused call
            return r;
        }, d.error);
        expect_refused([&] {
            OutputRequest r{EKO_OUTPUT_MEMORY, nullptr, nullptr, 0};
            return eko_enc_jpeg_to_buffer_full_buffer(&info, &r, 75);
        }, d.error);
        expect_refused([&] { return eko_enc_jpeg_to_stream(&info, ignore, 75, const_cast<EncodeOptions*>(&options)); }, d.error);
        expect_refused([&] {
            OutputRequest r{EKO_OUTPUT_FILE, DORVATEKO_OsFopen(path.c_str(), "wb"), nullptr, 0};
            return eko_enc_jpeg_to_file_full_buffer(&info, &r, 75);
        }, d.error);
        expect_refused([&] { return eko_enc_jpeg_to_file_ex(&info, path.c_str(), &options); }, d.error);
        // The file was created by the open and closed unwritten.
        EXPECT_TRUE(file_exists(path));
        EXPECT_TRUE(read_file(path).empty());
    }
    std::remove(path.c_str());

    // Only the format word's low byte counts.
    const Bytes grey(300, 0x55);
    const ImageInfo plain = image_info(grey.data(), 20, 15, EKO_FORMAT_GREY);
    const ImageInfo high = image_info(grey.data(), 20, 15, 0x7F00 | EKO_FORMAT_GREY);
    EXPECT_EQ(encode_to_memory(high, 75), encode_to_memory(plain, 75));
}

TEST(Creation, RefusesOutputKindsOtherThanFileMemoryAndStream) {
    const Bytes px(16 * 16, 0x80);
    const ImageInfo info = image_info(px.data(), 16, 16, EKO_FORMAT_GREY);
    const EncodeOptions options{75, nullptr, 0};
    for (uint32_t kind : {2u, 3u, 5u, 8u, 0xFFFFFFFFu}) {
        SCOPED_TRACE(kind);
        uint8_t block[4096];
        const OutputRequest request{kind, nullptr, block, sizeof block};
        expect_refused([&] { return __eko_jpeg_enc_initiaize(&info, &request, &options, nullptr) != nullptr ? 1u : 0u; },
                       EKO_ERR_ARGUMENT);
    }
}

TEST(Creation, RefusesSettingsThatTheGeometryCannotServe) {
    struct Row {
        const char* what;
        uint32_t format;
        std::function<void(EncoderSettings&)> change;
    };
    const Row rows[] = {
        {"no component", EKO_FORMAT_YUV420, [](EncoderSettings& s) { s.num_components = 0; }},
        {"two components", EKO_FORMAT_YUV420, [](EncoderSettings& s) { s.num_components = 2; }},
        {"four components", EKO_FORMAT_YUV420, [](EncoderSettings& s) { s.num_components = 4; }},
        {"horizontal factor 0", EKO_FORMAT_YUV420, [](EncoderSettings& s) { s.component_specs[1][1] = 0; }},
        {"vertical factor 0", EKO_FORMAT_YUV420, [](EncoderSettings& s) { s.component_specs[0][2] = 0; }},
        {"factor 3", EKO_FORMAT_YUV420, [](EncoderSettings& s) { s.component_specs[0][1] = 3; }},
        {"12 blocks per MCU",
         EKO_FORMAT_YUV420, [](EncoderSettings& s) { s.component_specs[1][1] = s.component_specs[1][2] = s.component_specs[2][1] = s.component_specs[2][2] = 2; }},
        {"five tables", EKO_FORMAT_YUV420, [](EncoderSettings& s) { s.num_quant_tables = 5; }},
        {"a component naming table 2 of 2", EKO_FORMAT_YUV420, [](EncoderSettings& s) { s.component_specs[2][0] = 2; }},
        {"negative table count", EKO_FORMAT_YUV420, [](EncoderSettings& s) { s.num_quant_tables = -1; }},
        {"a table entry of 0", EKO_FORMAT_YUV420, [](EncoderSettings& s) { s.quant_tables[1][17] = 0; }},
        {"grey with three components", EKO_FORMAT_GREY, [](EncoderSettings&) {}},
        {"RGB888 with one component", EKO_FORMAT_RGB888, [](EncoderSettings& s) { s.num_components = 1; }},
        {"RGB565 coded 4:2:2", EKO_FORMAT_RGB565, [](EncoderSettings& s) { s.component_specs[0][2] = 1; }},
        {"BGRA8888 coded 4:4:4", EKO_FORMAT_BGRA8888, [](EncoderSettings& s) { s.component_specs[0][1] = s.component_specs[0][2] = 1; }},
        {"RGBA8888 with chroma 2x2", EKO_FORMAT_RGBA8888, [](EncoderSettings& s) { s.component_specs[2][1] = 2; }},
    };
    const Bytes px(48 * 40 * 4, 0x66);
    for (const Row& row : rows) {
        SCOPED_TRACE(row.what);
        const ImageInfo info = image_info(px.data(), 48, 40, row.format);
        EncoderSettings s = settings_420();
        if (row.format != EKO_FORMAT_GREY) {  // the unchanged record is accepted
            const Bytes control = encode_with_settings(info, &s);
            ASSERT_FALSE(control.empty());
            EXPECT_TRUE(decode_jpeg(control).ok);
        }
        row.change(s);
        expect_refused([&] { return encode_with_settings(info, &s).empty() ? 0u : 1u; }, EKO_ERR_SAMPLING);
    }
}

TEST(Creation, SingleComponentSettingsAreCodedOneByOne) {
    const Bytes rgb = photo_rgb(37, 21, 4);
    const Bytes grey = rgb_to_grey(rgb, 37, 21);
    const Bytes yuv = rgb_to_yuv420(rgb, 37, 21);
    EncoderSettings s = settings_420();
    s.num_components = 1;
    const Bytes reference = encode_with_settings(image_info(grey.data(), 37, 21, EKO_FORMAT_GREY), &s);
    ASSERT_FALSE(reference.empty());
    for (uint8_t f : {1, 2}) {
        s.component_specs[0][1] = s.component_specs[0][2] = f;
        // Format 2 with one component codes its Y plane alone, exactly as grey.
        for (uint32_t format : {EKO_FORMAT_GREY, EKO_FORMAT_YUV420}) {
            SCOPED_TRACE(std::to_string(f) + "x" + std::to_string(f) + " format " + std::to_string(format));
            const Bytes jpeg = encode_with_settings(image_info(format == EKO_FORMAT_GREY ? grey.data() : yuv.data(), 37, 21, format), &s);
            const size_t sof = find_marker(jpeg, 0xC0);
            ASSERT_NE(sof, std::string::npos);
            EXPECT_EQ(jpeg[sof + 9], 1);      // one component
            EXPECT_EQ(jpeg[sof + 11], 0x11);  // whatever the record said
            EXPECT_EQ(jpeg, reference);
            const Decoded d = decode_jpeg(jpeg);
            EXPECT_TRUE(d.ok && !d.warning) << d.message;
        }
    }
}

TEST(Creation, SettingsWithoutDriGiveAStreamWithoutRestartMarkers) {
    const Bytes yuv = rgb_to_yuv420(photo_rgb(64, 64, 2), 64, 64);
    EncoderSettings s = settings_420();
    s.write_dri = 0;
    const Bytes jpeg = encode_with_settings(image_info(yuv.data(), 64, 64, EKO_FORMAT_YUV420), &s);
    ASSERT_FALSE(jpeg.empty());
    EXPECT_EQ(find_marker(jpeg, 0xDD), std::string::npos);
    for (uint8_t rst = 0xD0; rst <= 0xD7; ++rst) EXPECT_EQ(find_marker(jpeg, rst), std::string::npos) << int(rst);
    const Decoded d = decode_jpeg(jpeg);
    EXPECT_TRUE(d.ok && !d.warning) << d.message;
    s.write_dri = 1;
    EXPECT_NE(find_marker(encode_with_settings(image_info(yuv.data(), 64, 64, EKO_FORMAT_YUV420), &s), 0xD2),
              std::string::npos);
}

TEST(Creation, PlaneOffsetsOfTheLargestImageDoNotOverflow) {
    // 49999 x 49999 passes 2^31 bytes; creation only places the plane pointers.
    static const uint8_t anchor[1] = {0};
    const ImageInfo info = image_info(anchor, 49999, 49999, EKO_FORMAT_YUV420);
    const OutputRequest request{EKO_OUTPUT_STREAM, nullptr, nullptr, 0};
    const EncodeOptions options{75, nullptr, 0};
    EncoderContext* ctx = __eko_jpeg_enc_initiaize(&info, &request, &options, nullptr);
    ASSERT_NE(ctx, nullptr);
    const auto base = reinterpret_cast<uintptr_t>(anchor);
    EXPECT_EQ(reinterpret_cast<uintptr_t>(ctx->plane_u) - base, uintptr_t{49999} * 49999);
    EXPECT_EQ(reinterpret_cast<uintptr_t>(ctx->plane_v) - base, uintptr_t{49999} * 49999 + uintptr_t{25000} * 25000);
    EXPECT_EQ(ctx->restart_interval, 3125u);
    DORVATEKO_OsFree(ctx->work_buffer);
    __eko_jpeg_enc_release_mem(ctx);
    DORVATEKO_OsFree(ctx);
}

TEST(Errors, TheLastCodeIsKeptPerThread) {
    const Bytes px(64, 0);
    auto refused = [&](int w, uint32_t format) {
        const ImageInfo info = image_info(px.data(), w, 8, format);
        return eko_enc_jpeg_to_stream(&info, ignore, 75, const_cast<uint8_t*>(px.data())) == 0;
    };
    EXPECT_TRUE(refused(8, 3));
    uint32_t other = 0;
    std::thread([&] {
        EXPECT_TRUE(refused(0, EKO_FORMAT_GREY));
        other = eko_GetLastError();
    }).join();
    EXPECT_EQ(other, static_cast<uint32_t>(EKO_ERR_DIMENSIONS));
    EXPECT_EQ(eko_GetLastError(), static_cast<uint32_t>(EKO_ERR_FORMAT));
}
