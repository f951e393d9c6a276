// Stream completion: pad the last byte with 1-bits, append EOI (unless more
// bands follow), hand the rest on or fix the memory stream's length.
#include "api/output_target.h"

namespace tekoj {
namespace {

bool complete(EncoderContext* ctx, bool with_eoi) {
    if (!make_room(ctx, 10, 10)) return false;
    __eko_jpeg_enc_finish_compression(ctx);
    OutputTarget* t = ctx->output;
    if (with_eoi) put_u16(t, 0xFFD9);
    bool ok = true;
    if (t->kind == EKO_OUTPUT_MEMORY) {
        t->total = t->used;
    } else {
        ok = hand_on(ctx, t);
        if (ctx->work_buffer != nullptr) DORVATEKO_OsFree(ctx->work_buffer);
        ctx->work_buffer = nullptr;
        t->buffer = nullptr;  // the work buffer is gone; only `total` means something now
    }
    ctx->finished = 1;
    return ok;
}

}  // namespace
}  // namespace tekoj

extern "C" {

EKO_API uint32_t __eko_jpeg_enc_finish_compression(EncoderContext* context) {
    EntropyState* es = context->entropy;
    WorkingState ws{es->put_buffer, es->put_bits, {es->last_dc_val[0], es->last_dc_val[1], es->last_dc_val[2]},
                    context};
    __eko_jpeg_enc_write_bits(&ws, 0x7F, 7);
    es->put_buffer = ws.put_buffer;
    es->put_bits = ws.put_bits;
    return 1;
}

EKO_API uint32_t __eko_jpeg_enc_make_end_mark(EncoderContext* context) {
    return tekoj::complete(context, true) ? 1 : 0;
}

EKO_API uint32_t __eko_jpeg_enc_make_without_end_mark(EncoderContext* context) {
    return tekoj::complete(context, false) ? 1 : 0;
}

}  // extern "C"
