// Stream completion: pad the last byte with 1-bits, append EOI (unless more
// bands follow), hand the rest on or fix the memory stream's length.
#include "api/context.h"
#include "core/entropy_coder.h"
#include "sink/output_target.h"

namespace tekoj {

bool complete_stream(EncoderContext* ctx, bool with_eoi) {
    if (!make_room(ctx, 10, 10)) return false;
    pad_final_byte(ctx);
    if (with_eoi) put_u16(ctx->output, 0xFFD9);
    const bool ok = finish_output(sink_of(ctx));
    if (ctx->work_buffer != nullptr) {
        // The work buffer is gone; only `total` means something now.
        DORVATEKO_OsFree(ctx->work_buffer);
        ctx->work_buffer = nullptr;
        ctx->output->buffer = nullptr;
    }
    ctx->finished = 1;
    return ok;
}

}  // namespace tekoj

extern "C" {

EKO_API uint32_t __eko_jpeg_enc_finish_compression(EncoderContext* context) {
    tekoj::pad_final_byte(context);
    return 1;
}

EKO_API uint32_t __eko_jpeg_enc_make_end_mark(EncoderContext* context) {
    return tekoj::complete_stream(context, true) ? 1 : 0;
}

EKO_API uint32_t __eko_jpeg_enc_make_without_end_mark(EncoderContext* context) {
    return tekoj::complete_stream(context, false) ? 1 : 0;
}

}  // extern "C"
