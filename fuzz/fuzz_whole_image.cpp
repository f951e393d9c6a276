// Whole-image entry points: any size up to a few hundred pixels, any format
// code and quality, every member (so every output kind), band mode with the
// caller's band words, and the exported steps driven with an EncoderSettings
// record. Every reported success must decode cleanly at the size asked for.
#include "fuzz_support.h"

#include <algorithm>
#include <string>
#include <unistd.h>

using namespace tekoj_fuzz;

namespace {

const std::string& path() {
    static const std::string p = "/dev/shm/tekoj_fuzz_" + std::to_string(::getpid()) + ".jpg";
    return p;
}

Bytes read_back() {
    Bytes out;
    if (std::FILE* f = std::fopen(path().c_str(), "rb")) {
        uint8_t buf[4096];
        for (size_t n; (n = std::fread(buf, 1, sizeof buf, f)) > 0;) out.insert(out.end(), buf, buf + n);
        std::fclose(f);
    }
    return out;
}

// One call of member `m`; the stream on success, nothing otherwise.
bool encode(int m, const ImageInfo& info, uint32_t q, int32_t start, Bytes& out) {
    const EncodeOptions options{q, nullptr, 0};
    uint8_t* buffer = start > 0 ? static_cast<uint8_t*>(DORVATEKO_OsMalloc(uint32_t(start))) : nullptr;
    int32_t length = start;
    OutputRequest request{0, nullptr, buffer, uint32_t(start)};
    uint32_t r = 0;
    switch (m) {
        case 0: r = eko_enc_jpeg_to_file(&info, path().c_str(), q); break;
        case 1: r = eko_enc_jpeg_to_file_ex(&info, path().c_str(), &options); break;
        case 2:
        case 3:
            request.file = DORVATEKO_OsFopen(path().c_str(), "wb");
            r = m == 2 ? eko_enc_jpeg_to_file_full_buffer(&info, &request, q)
                       : eko_enc_jpeg_to_file_ex_full_buffer(&info, &request, &options);
            break;
        case 4: r = eko_enc_jpeg_to_buffer(&info, &buffer, &length, q); break;
        case 5: r = eko_enc_jpeg_to_buffer_ex(&info, &buffer, &length, &options); break;
        case 6:
        case 7:
            r = m == 6 ? eko_enc_jpeg_to_buffer_full_buffer(&info, &request, q)
                       : eko_enc_jpeg_to_buffer_ex_full_buffer(&info, &request, &options);
            buffer = request.buffer, length = int32_t(request.capacity);
            break;
        case 8: r = eko_enc_jpeg_to_stream(&info, collect, q, &out); break;
        default: r = eko_enc_jpeg_to_stream_ex(&info, collect, &options, &out);
    }
    if (m <= 3 && r == 1) out = read_back();
    if (m >= 4 && m <= 7 && r == 1) out.assign(buffer, buffer + length);
    if (m >= 4 && m <= 7) DORVATEKO_OsFree(buffer);  // null, the caller's own block or the stream's
    if (r != 0 && r != 1) finding("result neither 0 nor 1");
    if (r == 0 && eko_GetLastError() == EKO_OK) finding("failure without a reason");
    return r == 1;
}

// Band mode: the image cut into bands of the fuzzer's heights, joined.
bool encode_bands(Input& in, const ImageInfo& whole, uint32_t q, Bytes& out) {
    const int unit = (whole.format & 0xFF) == EKO_FORMAT_GREY ? 8 : 16;
    const bool planar = (whole.format & 0xFF) == EKO_FORMAT_YUV420;
    const size_t row = planar ? size_t(whole.width) : image_bytes(whole.format, whole.width, 1);
    const auto* px = static_cast<const uint8_t*>(whole.data);
    for (int top = 0; top < whole.height;) {
        int rows = int(in.range(1, 4)) * unit;
        const bool last = top + rows >= whole.height || in.u8() == 0xFF;
        if (last) rows = whole.height - top;
        // A planar band gets its own planes.
        Bytes band(px + row * top, px + row * (top + rows));
        const size_t cw = size_t(whole.width + 1) / 2, ch = size_t(whole.height + 1) / 2;
        for (size_t plane = 0; planar && plane < 2; ++plane) {
            const uint8_t* first = px + size_t(whole.width) * whole.height + plane * cw * ch + cw * (top / 2);
            band.insert(band.end(), first, first + cw * ((rows + 1) / 2));
        }
        const ImageInfo info{whole.width, rows, band.data(), 1, top > 0, !last, whole.height, top, whole.format,
                             nullptr};
        Bytes piece;
        if (!encode(5, info, q, 0, piece)) return false;
        out.insert(out.end(), piece.begin(), piece.end());
        top += rows;
    }
    return true;
}

// The exported steps with an EncoderSettings record, into memory.
bool encode_with_settings(Input& in, const ImageInfo& info, uint32_t q, Bytes& out) {
    const EncoderSettings s = settings_from(in);
    const OutputRequest request{EKO_OUTPUT_MEMORY, nullptr, nullptr, 0};
    const EncodeOptions options{q, nullptr, 0};
    EncoderContext* ctx = __eko_jpeg_enc_initiaize(&info, &request, &options, &s);
    if (ctx == nullptr) return false;
    bool ok = __eko_jpeg_enc_make_header(ctx) == 1;
    for (; ok && ctx->next_row < uint32_t(ctx->height); ctx->next_row = uint16_t(ctx->next_row + ctx->max_v_samp * 8))
        ok = __eko_jpeg_enc_process_image_data(ctx) == 1;
    ok = ok && __eko_jpeg_enc_make_end_mark(ctx) == 1;
    if (ok) out.assign(ctx->output->buffer, ctx->output->buffer + ctx->output->total);
    DORVATEKO_OsFree(ctx->output->buffer);
    DORVATEKO_OsFree(ctx->work_buffer);
    __eko_jpeg_enc_release_mem(ctx);
    DORVATEKO_OsFree(ctx);
    return ok;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    Input in(data, size);
    // Mostly small images, so that a run makes thousands of calls a second;
    // sometimes a side of up to 300 pixels, at most 16384 pixels in all.
    const bool large = in.u8() >= 240;
    const int w = int(in.range(1, large ? 300 : 40));
    const int h = std::min(int(in.range(1, large ? 300 : 40)), 16384 / w);
    const uint32_t mode = in.u8() % 12, q = in.range(0, 110);
    uint32_t format = in.u8();
    static const uint32_t kAccepted[] = {0, 1, 2, 4, 7, 8};
    if (in.u8() % 8 != 0) format = kAccepted[format % 6];  // mostly accepted codes
    // An EncoderSettings record may choose other samplings than 4:2:0; its
    // chroma planes can then be as large as the luma plane.
    const bool own_sampling = mode == 11 && (format & 0xFF) == EKO_FORMAT_YUV420;
    const Bytes px = in.fill(own_sampling ? 3 * size_t(w) * h : image_bytes(format, w, h));
    const ImageInfo info{w, h, px.data(), 0, 0, 0, 0, 0, format, nullptr};
    Bytes out;
    bool ok;
    if (mode < 10) {
        ok = encode(int(mode), info, q, mode == 4 && in.flag() ? int32_t(in.range(1, 5000)) : 0, out);
    } else if (mode == 10) {
        ok = encode_bands(in, info, q, out);
    } else {
        ok = encode_with_settings(in, info, q, out);
    }
    if (ok) expect_decodes(out, w, h);
    std::remove(path().c_str());
    return 0;
}
