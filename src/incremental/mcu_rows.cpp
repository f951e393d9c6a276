// MCU-row interface: an encoder that lives across calls. Creation writes the
// header at once; each band call codes one MCU row from the caller's band
// buffer; finishing completes the stream and hands it over.
//
// A context that has failed (its output could not grow, a write came up
// short) accepts no further coding; finishing it frees everything and hands
// back no stream. Calls refused for misuse (a band after the last one, a
// stream target without its callback) write nothing and leave the encode as
// it was.
#include "api/context.h"
#include "sink/output_target.h"
#include "core/band_driver.h"
#include "core/header_writer.h"
#include "input/formats.h"
#include "incremental/incremental.h"

namespace tekoj {
namespace {

// The band buffer has fixed regions: 16 luma rows of `width` bytes, then
// 8 rows of (width + 1) / 2 bytes for each chroma plane. The planar reader
// takes band_rows rows of downsampled_width bytes from the start of each
// region, so a sampling whose rows overrun their region (chroma not halved
// horizontally, or doubled vertically) would read past the caller's buffer.
// 4:2:0, 4:2:2 and single-component images fit.
bool band_regions_fit(const EncoderContext* ctx) {
    const FormatTraits* format = format_traits(ctx->format);
    if (!format->planar || format->components == 1) return true;  // grey reads 8 luma rows; RGB reads no band buffer
    const uint64_t w = static_cast<uint64_t>(ctx->width);
    const uint64_t chroma = ((w + 1) >> 1) * 8;
    const uint64_t region[3] = {w * 16, chroma, chroma};
    for (uint32_t c = 0; c < ctx->num_components && c < 3; ++c) {
        const ComponentInfo& comp = ctx->comp_info[c];
        if (static_cast<uint64_t>(comp.band_rows) * comp.downsampled_width > region[c]) return false;
    }
    return true;
}

// Formats whose reader takes its samples from the band buffer.
bool reads_band_buffer(const EncoderContext* ctx) { return format_traits(ctx->format)->planar; }

uint32_t band_call(EncoderContext* ctx, const uint8_t* band, uint32_t* next_row_out) {
    eko_SetError(EKO_OK);
    if (ctx == nullptr || next_row_out == nullptr) return refuse(EKO_ERR_ARGUMENT);
    if (band == nullptr && reads_band_buffer(ctx)) return refuse(EKO_ERR_ARGUMENT);
    // RGB readers take the whole image from ImageInfo.data.
    if (!reads_band_buffer(ctx) && ctx->read_ptr == nullptr) return refuse(EKO_ERR_ARGUMENT);
    // Refused here rather than at init: the row and column drivers serve
    // these samplings from the caller's coefficients.
    if (!band_regions_fit(ctx)) return refuse(EKO_ERR_SAMPLING);
    if (!may_code_rows(ctx)) return 0;

    if (band != nullptr) {
        const size_t w = static_cast<size_t>(ctx->width);
        ctx->plane_y = band;
        ctx->plane_u = band + w * 16;
        ctx->plane_v = ctx->plane_u + ((w + 1) >> 1) * 8;
    } else {
        // RGB formats read through read_ptr; the plane pointers are unused.
        ctx->plane_y = ctx->plane_u = ctx->plane_v = nullptr;
    }
    if (!process_band(ctx)) return 0;
    ctx->next_row = static_cast<uint16_t>(ctx->next_row + ctx->max_v_samp * 8u);
    *next_row_out = ctx->next_row;
    return 1;
}

}  // namespace

bool may_code_rows(EncoderContext* ctx) {
    if (ctx->failed != 0) {
        eko_SetError(ctx->failed);
        return false;
    }
    if (ctx->columns != nullptr || image_complete(ctx) || !output_ready(ctx)) {
        eko_SetError(EKO_ERR_STATE);
        return false;
    }
    return true;
}

void release_row_streams(EncoderContext* ctx) {
    RowStream** rows = ctx->columns;
    if (rows == nullptr) return;
    for (uint32_t r = 0; r < ctx->total_imcu_rows; ++r) {
        RowStream* row = rows[r];
        if (row == nullptr) continue;
        if (row->row_target != nullptr) {
            if (row->row_target->buffer != nullptr) DORVATEKO_OsFree(row->row_target->buffer);
            DORVATEKO_OsFree(row->row_target);
        }
        DORVATEKO_OsFree(row);
    }
    DORVATEKO_OsFree(rows);
    ctx->columns = nullptr;
    if (ctx->saved_output != nullptr) ctx->output = ctx->saved_output;
    ctx->restart_suspended = 0;
}

void release_context(EncoderContext* ctx) {
    release_row_streams(ctx);
    discard_context(ctx);
}

}  // namespace tekoj

extern "C" {

EKO_API EncoderContext* eko_jpeg_enc_mcu_init(const ImageInfo* image_info, const OutputRequest* output_request,
                                              const EncodeOptions* options, const EncoderSettings* settings) {
    eko_SetError(EKO_OK);
    EncoderContext* ctx = tekoj::create_context(image_info, output_request, options, settings);
    if (ctx == nullptr) return nullptr;
    // The EXIF pointer stays null: this interface never writes APP1. A header
    // that could not be written (a memory block that failed to grow, which
    // also frees the caller's block) leaves the context failed rather than
    // returning null, so that the caller learns from the finish call that
    // the block is gone instead of freeing it a second time.
    tekoj::write_header(ctx);
    return ctx;
}

EKO_API uint32_t eko_jpeg_enc_mcu_set_stream(EncoderContext* context, EkoStreamCallback callback,
                                             void* callback_arg) {
    using namespace tekoj;
    eko_SetError(EKO_OK);
    if (context == nullptr || callback == nullptr) return refuse(EKO_ERR_ARGUMENT);
    OutputTarget* t = main_target(context);
    if (t->kind != EKO_OUTPUT_STREAM) return refuse(EKO_ERR_ARGUMENT);
    // Once bytes have gone to one callback, the rest must follow them there.
    if (context->failed != 0 || context->finished != 0 || coding_started(context)) return refuse(EKO_ERR_STATE);
    t->callback = callback;
    t->callback_arg = callback_arg;
    return 1;
}

EKO_API uint32_t eko_jpeg_enc_muc_process(EncoderContext* context, const uint8_t* band, uint32_t* next_row_out) {
    return tekoj::band_call(context, band, next_row_out);
}

EKO_API uint32_t eko_jpeg_enc_col_muc_process(EncoderContext* context, const uint8_t* band,
                                              uint32_t* next_row_out) {
    return tekoj::band_call(context, band, next_row_out);
}

EKO_API uint8_t* eko_jpeg_enc_mcu__get_encdata(EncoderContext* context, uint8_t** buffer_out,
                                               uint32_t* length_out) {
    eko_SetError(EKO_OK);
    if (context == nullptr || buffer_out == nullptr || length_out == nullptr) {
        eko_SetError(EKO_ERR_ARGUMENT);
        return nullptr;
    }
    if (context->failed != 0 || context->finished != 0) {
        // The buffer may be gone or hold a stream that will never be valid.
        eko_SetError(context->failed != 0 ? context->failed : uint32_t{EKO_ERR_STATE});
        *buffer_out = nullptr;
        *length_out = 0;
        return nullptr;
    }
    *buffer_out = context->output->buffer;
    *length_out = context->output->used;
    return context->output->buffer;
}

EKO_API void eko_jpeg_enc_mcu_finish(EncoderContext* context, uint8_t** buffer_out, uint32_t* length_out) {
    using namespace tekoj;
    eko_SetError(EKO_OK);
    if (context == nullptr) return;
    if (context->columns != nullptr) {
        // Column-split rows that were never joined are missing from the
        // scan: no valid stream can come out of this encode.
        release_row_streams(context);
        fail(context, EKO_ERR_STATE);
    }
    if (context->failed == 0 && context->finished == 0) tekoj::complete_stream(context, true);

    OutputTarget* t = context->output;
    uint8_t* buffer = nullptr;
    uint32_t length = 0;
    if (context->failed == 0) {
        buffer = t->buffer;
        length = t->total;
    } else {
        eko_SetError(context->failed);  // why no stream comes back, even if an earlier call said so
        if (t->kind == EKO_OUTPUT_MEMORY && t->buffer != nullptr) DORVATEKO_OsFree(t->buffer);
        t->buffer = nullptr;
    }
    if (buffer_out != nullptr) *buffer_out = buffer;
    if (length_out != nullptr) *length_out = length;
    release_context(context);
}

}  // extern "C"
