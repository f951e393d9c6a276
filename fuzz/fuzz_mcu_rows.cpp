// The MCU-row interface with the row and column-split drivers: random
// settings, formats, sizes and targets, then any sequence of calls (bands,
// coefficient rows, column set-up, columns, joins, encdata, a callback)
// with random coefficient blocks. Calls may be refused in any order; a
// stream handed back for an image whose every MCU row was coded must decode
// cleanly at the size asked for.
#include "fuzz_support.h"

using namespace tekoj_fuzz;

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    Input in(data, size);
    const int w = int(in.range(1, 80)), h = int(in.range(1, 80));
    static const uint32_t kFormats[] = {0, 1, 2, 4, 7, 8, 3};
    const uint32_t format = kFormats[in.u8() % 7];
    const bool with_settings = in.flag();
    const EncoderSettings s = settings_from(in);
    static const uint32_t kKinds[] = {EKO_OUTPUT_MEMORY, EKO_OUTPUT_FILE, EKO_OUTPUT_STREAM};
    const uint32_t kind = kKinds[in.u8() % 3];
    const Bytes px = in.fill(image_bytes(format, w, h));
    const ImageInfo info{w, h, in.flag() ? px.data() : nullptr, 0, 0, 0, 0, 0, format, nullptr};
    void* file = kind == EKO_OUTPUT_FILE ? DORVATEKO_OsFopen("/dev/null", "wb") : nullptr;
    const uint32_t start = in.u8() % 2 && kind == EKO_OUTPUT_MEMORY ? in.range(1, 3000) : 0;
    uint8_t* block = start ? static_cast<uint8_t*>(DORVATEKO_OsMalloc(start)) : nullptr;
    const OutputRequest request{kind, file, block, start};
    const EncodeOptions options{in.range(0, 101), nullptr, 0};
    EncoderContext* ctx = eko_jpeg_enc_mcu_init(&info, &request, &options, with_settings ? &s : nullptr);
    if (ctx == nullptr) {
        DORVATEKO_OsFree(block);  // still ours
        if (file != nullptr) DORVATEKO_OsFclose(file);
        if (eko_GetLastError() == EKO_OK) finding("refused without a reason");
        return 0;
    }
    Bytes streamed;
    const Bytes band = in.fill(size_t(w) * 32);
    // Coefficient blocks for a whole column or row; values mostly small.
    const uint32_t rows = ctx->total_imcu_rows, per_row = ctx->mcus_per_row, count = rows > per_row ? rows : per_row;
    std::vector<int16_t> coefficients(size_t(count) * 10 * 64);
    std::vector<McuBlockList> lists(count);
    for (uint32_t k = 0; k < count; ++k)
        for (int b = 0; b < 10; ++b) lists[k].blocks[b] = &coefficients[(size_t(k) * 10 + b) * 64];
    for (int step = 0; step < 64 && in.left() > 0; ++step) {
        uint32_t next = 0;
        const uint32_t op = in.u8() % 9;
        if (op <= 3) {  // fresh coefficients for the next row or column call: mostly 0, some too large
            uint32_t seed = in.u16();
            const uint32_t shift = in.u8() % 12;
            for (auto& c : coefficients) {
                seed = seed * 1664525u + 1013904223u;
                c = (seed >> 28) < 10 ? 0 : int16_t((int32_t((seed >> 8) % 4096) - 2048) >> shift);
            }
        }
        switch (op) {
            case 0: eko_jpeg_enc_muc_process(ctx, band.data(), &next); break;
            case 1: eko_jpeg_enc_col_muc_process(ctx, in.flag() ? band.data() : nullptr, &next); break;
            case 2: __eko_jpeg_enc_entroy_encoder(ctx, lists.data(), &next); break;
            case 3: __eko_jpeg_enc_col_entroy_encoder(ctx, lists.data(), &next); break;
            case 4: __eko_jpeg_enc_col_encoder_init(ctx); break;
            case 5: __eko_jpeg_enc_col_encoder_finish(ctx); break;
            case 6: eko_jpeg_enc_mcu_set_stream(ctx, collect, &streamed); break;
            case 7: {
                uint8_t* b = nullptr;
                uint32_t n = 0;
                if (eko_jpeg_enc_mcu__get_encdata(ctx, &b, &n) != b) finding("encdata result");
                break;
            }
            default: __OvidanJpegEncEntroyEncoder(ctx, lists.data(), &next);
        }
    }
    // Mostly finish the job as a careful caller would, so that whole streams
    // are decoded: the remaining columns and the join, or the remaining rows
    // by bands and by the row driver in turn; small coefficients.
    if (in.u8() % 4 != 3) {
        for (size_t k = 0; k < coefficients.size(); ++k) coefficients[k] = int16_t(int(k * 2654435761u >> 28) - 8);
        uint32_t next = 0;
        for (uint32_t col = 0; ctx->columns != nullptr && col < per_row; ++col)
            __eko_jpeg_enc_col_entroy_encoder(ctx, lists.data(), &next);
        __eko_jpeg_enc_col_encoder_finish(ctx);
        for (uint32_t row = 0; row < rows; ++row)
            if ((row % 2 ? eko_jpeg_enc_muc_process(ctx, band.data(), &next)
                         : __eko_jpeg_enc_entroy_encoder(ctx, lists.data(), &next)) == 0)
                break;
    }
    const bool complete = ctx->mcu_state->imcu_row >= ctx->total_imcu_rows && ctx->columns == nullptr;
    uint8_t* out = nullptr;
    uint32_t length = 0;
    eko_jpeg_enc_mcu_finish(ctx, &out, &length);
    if (file != nullptr) DORVATEKO_OsFclose(file);
    Bytes stream = kind == EKO_OUTPUT_MEMORY && out != nullptr ? Bytes(out, out + length) : streamed;
    if (kind == EKO_OUTPUT_MEMORY) DORVATEKO_OsFree(out);
    const bool handed_back = kind == EKO_OUTPUT_MEMORY ? out != nullptr : length != 0;
    if (handed_back && kind == EKO_OUTPUT_STREAM && stream.size() != length) finding("stream length");
    if (handed_back && complete && kind != EKO_OUTPUT_FILE) expect_decodes(stream, w, h);
    return 0;
}
