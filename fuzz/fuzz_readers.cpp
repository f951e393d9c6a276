// The exported readers and conversions that no format code selects: the
// packed 4:2:2 readers and the interleaved V/U reader on random contexts,
// the down-scaler (checked against the closed form of its taps) and the two
// RGB565 converters (checked against each other). Buffers are exactly as
// large as the arguments say, so a read or write past them is caught.
#include "fuzz_support.h"

using namespace tekoj_fuzz;

namespace {

// Header, one reader call and one coding pass per band, end; decoded.
void code_frame(Input& in, int w, int h, int reader) {
    const EncoderSettings s = settings_from(in);
    const bool with_settings = reader != 2 && in.flag();
    const int cw = (w + 1) / 2, ch = (h + 1) / 2;
    const Bytes frame = in.fill(reader == 2 ? size_t(w) * h + 2 * size_t(cw) * ch : size_t(h) * (w / 2) * 4);
    const ImageInfo info{w, h, frame.data(), 0, 0, 0, 0, 0, EKO_FORMAT_YUV420, nullptr};
    const OutputRequest request{EKO_OUTPUT_MEMORY, nullptr, nullptr, 0};
    const EncodeOptions options{in.range(1, 100), nullptr, 0};
    EncoderContext* ctx = __eko_jpeg_enc_initiaize(&info, &request, &options, with_settings ? &s : nullptr);
    if (ctx == nullptr) return;
    if (reader == 2) ctx->plane_v = frame.data() + size_t(w) * h;  // V/U pairs after the luma plane
    bool ok = __eko_jpeg_enc_make_header(ctx) == 1;
    for (uint32_t band = 0; ok && band < ctx->total_imcu_rows; ++band) {
        const uint32_t r = reader == 0   ? __eko_jpeg_enc_get_raw_duoview422_data(ctx)
                           : reader == 1 ? __eko_jpeg_enc_get_raw_duoview422_data_for_yuv422(ctx)
                                         : __eko_jpeg_enc_get_raw_pvu_data(ctx);
        if (r == 0 && eko_GetLastError() == EKO_OK) finding("reader refused without a reason");
        ok = r == 1 && __eko_jpeg_enc_compress_data(ctx, ctx->sample_rows->row_arrays) == 1;
        ++ctx->sample_rows->band_counter;
    }
    ok = ok && __eko_jpeg_enc_make_end_mark(ctx) == 1;
    const Bytes out = ok ? Bytes(ctx->output->buffer, ctx->output->buffer + ctx->output->total) : Bytes{};
    DORVATEKO_OsFree(ctx->output->buffer);
    __eko_jpeg_enc_release_mem(ctx);
    DORVATEKO_OsFree(ctx);
    if (ok) expect_decodes(out, w, h);
}

void down_scale(Input& in) {
    const int sw = int(in.range(0, 64)), sh = int(in.range(0, 64)) - 1;
    const int stride = sw + int(in.range(0, 3)) - 1, dw = int(in.range(0, 70)), dh = int(in.range(0, 70));
    const size_t src_bytes = sh > 0 && stride > 0 ? size_t(sh) * 2 * size_t(stride) : 1;
    const size_t dst_bytes = dw > 0 && dh > 0 ? size_t(dw) * dh + 2 * size_t((dw + 1) / 2) * ((dh + 1) / 2) : 1;
    const Bytes src = in.fill(src_bytes);
    Bytes dst(dst_bytes, 0xA5);
    __eko_jpeg_enc_down_scale_yuv422(src.data(), sw, sh, stride, dst.data(), dw, dh);
    if (eko_GetLastError() != EKO_OK) {
        if (dst != Bytes(dst_bytes, 0xA5)) finding("refused down-scale wrote");
        return;
    }
    // Output pixel (i, k) averages the source at columns (sw/4 + i*sw)/dw and
    // (3sw/4 + i*sw)/dw and rows chosen the same way; chroma from even rows
    // and columns.
    const auto tap = [](int n, int i, int d, bool first) { return ((first ? n >> 2 : (3 * n) >> 2) + i * n) / d; };
    const auto mean = [&](int i, int k, int byte) {
        int sum = 0;
        for (bool r : {true, false})
            for (bool c : {true, false}) {
                const int x = tap(sw, i, dw, c), y = tap(sh, k, dh, r);
                sum += src[size_t(y) * 2 * stride + (byte ? (2 * x & ~3) + byte : 2 * x)];
            }
        return uint8_t(sum / 4);
    };
    const size_t cw = size_t(dw + 1) / 2, plane = cw * size_t((dh + 1) / 2);
    for (int k = 0; k < dh; ++k)
        for (int i = 0; i < dw; ++i) {
            bool same = dst[size_t(k) * dw + i] == mean(i, k, 0);
            if (k % 2 == 0 && i % 2 == 0) {
                const size_t c = size_t(dw) * dh + size_t(k / 2) * cw + size_t(i / 2);
                same = same && dst[c] == mean(i, k, 1) && dst[c + plane] == mean(i, k, 3);
            }
            if (!same) finding("down-scaled pixel differs from its closed form");
        }
}

void rgb565(Input& in) {
    const int w = int(in.range(0, 66)) - 2, h = int(in.range(0, 66)) - 2;
    const size_t n = w > 0 && h > 0 ? size_t(w) * h : 1, cw = size_t(w + 1) / 2, ch = size_t(h + 1) / 2;
    const Bytes planar = in.fill(w > 0 && h > 0 ? n + 2 * cw * ch : 1);
    std::vector<uint16_t> a(n, 0x1234), b(n, 0x4321);
    const uint32_t ra = eko_DuoYUV420toRGB565(planar.data(), w, h, a.data());
    if (ra == 0) {
        if (eko_GetLastError() == EKO_OK || a != std::vector<uint16_t>(n, 0x1234)) finding("RGB565 refusal");
        return;
    }
    // The same chroma as V/U pairs gives the same pixels.
    Bytes interleaved(planar.begin(), planar.begin() + long(n));
    for (size_t k = 0; k < cw * ch; ++k) interleaved.insert(interleaved.end(), {planar[n + cw * ch + k], planar[n + k]});
    if (eko_DuoPYV0420toRGB565(interleaved.data(), w, h, b.data()) != 1 || a != b) finding("RGB565 converters differ");
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    Input in(data, size);
    const uint32_t what = in.u8() % 5;
    if (what < 3) {
        const uint32_t most = in.u8() >= 240 ? 90 : 40;
        code_frame(in, int(in.range(1, most)), int(in.range(1, most)), int(what));
    } else if (what == 3) {
        down_scale(in);
    } else {
        rgb565(in);
    }
    return 0;
}
