// Stream completion: pad the last byte with 1-bits, append EOI (unless more
// bands follow), hand the rest on or fix the memory stream's length.
#include "api/output_target.h"
#include "core/entropy_coder.h"

namespace tekoj {
namespace {

bool complete(EncoderContext* ctx, bool with_eoi) {
    if (!make_room(ctx, 10, 10)) return false;
    pad_final_byte(ctx);
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
    tekoj::pad_final_byte(context);
    return 1;
}

EKO_API uint32_t __eko_jpeg_enc_make_end_mark(EncoderContext* context) {
    return tekoj::complete(context, true) ? 1 : 0;
}

EKO_API uint32_t __eko_jpeg_enc_make_without_end_mark(EncoderContext* context) {
    return tekoj::complete(context, false) ? 1 : 0;
}

}  // extern "C"
