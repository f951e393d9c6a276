// Whole-image entry points: one call creates an encoder, writes the header,
// codes the image band by band, completes the stream and releases
// everything. The buffer member also codes single bands of a larger image.
#include "api/context.h"
#include "sink/output_target.h"
#include "core/band_driver.h"
#include "core/header_writer.h"
#include "input/formats.h"

namespace tekoj {
namespace {

constexpr uint32_t kMinMemoryBlock = 2048;

uint32_t band_height(const ImageInfo* info) {
    const FormatTraits* format = format_traits(info->format & 0xFF);
    return format != nullptr ? format->band_height : 16;
}

// Band words that cannot describe a valid piece of one stream.
bool band_words_valid(const ImageInfo* info) {
    if (info->band_mode == 0) return true;
    const int32_t bh = static_cast<int32_t>(band_height(info));
    if (info->band_open_end != 0 && info->height % bh != 0) return false;
    if (info->band_continued == 0) return info->total_height >= info->height && info->total_height <= 49999;
    // A later band follows at least one band, and starts on an MCU-row boundary.
    return info->band_top_row > 0 && info->band_top_row % bh == 0;
}

enum class Outcome { CreationFailed, Failed, Done };

struct Result {
    Outcome outcome;
    uint8_t* buffer;  // memory targets: the stream's block (null after a failure)
    uint32_t total;
};

// The caller's pixels must be there: every reader loads through `data`.
bool image_given(const ImageInfo* info) { return info != nullptr && info->data != nullptr; }

Result run(const ImageInfo* info, const OutputRequest& request, const EncodeOptions* options,
           EkoStreamCallback callback, void* callback_arg, bool allow_bands) {
    if (!image_given(info)) {
        eko_SetError(EKO_ERR_ARGUMENT);
        return {Outcome::CreationFailed, nullptr, 0};
    }
    EncoderContext* ctx = create_context(info, &request, options, nullptr);
    if (ctx == nullptr) return {Outcome::CreationFailed, nullptr, 0};
    if (request.kind == EKO_OUTPUT_STREAM) {
        ctx->output->callback = callback;
        ctx->output->callback_arg = callback_arg;
    }
    const bool band_mode = allow_bands && info->band_mode != 0;
    const bool later_band = band_mode && info->band_continued != 0;
    if (!later_band) {
        ctx->exif_info = info->exif_info;
        if (band_mode) ctx->height = info->total_height;
        tekoj::write_header(ctx);
        ctx->height = info->height;
    } else {
        // Continue the whole stream's restart numbering: the band starts with
        // the marker that follows the n intervals coded before it.
        const int32_t rows_before = info->band_top_row / (ctx->max_v_samp * 8);
        const int32_t n = static_cast<int32_t>(ctx->mcus_per_row) * rows_before /
                          static_cast<int32_t>(ctx->restart_interval);
        ctx->restart_mcu_count = 0;
        ctx->restart_index = static_cast<uint32_t>((n - 1) % 8);
    }

    const uint32_t band_rows = ctx->max_v_samp * 8u;
    while (ctx->failed == 0 && ctx->next_row < static_cast<uint32_t>(ctx->height)) {
        if (!process_band(ctx)) break;
        ctx->next_row = static_cast<uint16_t>(ctx->next_row + band_rows);
    }
    if (ctx->failed == 0) {
        if (band_mode && info->band_open_end != 0)
            tekoj::complete_stream(ctx, false);
        else
            tekoj::complete_stream(ctx, true);
    }

    Result r{ctx->failed == 0 ? Outcome::Done : Outcome::Failed, nullptr, 0};
    if (request.kind == EKO_OUTPUT_MEMORY) {
        if (r.outcome == Outcome::Done) {
            r.buffer = ctx->output->buffer;
            r.total = ctx->output->total;
        } else if (ctx->output->buffer != nullptr) {
            DORVATEKO_OsFree(ctx->output->buffer);
        }
    }
    discard_context(ctx);
    return r;
}

uint32_t to_file(const ImageInfo* info, void* file, const EncodeOptions* options) {
    OutputRequest request{EKO_OUTPUT_FILE, file, nullptr, 0};
    const Result r = run(info, request, options, nullptr, nullptr, false);
    // The C library may still hold the stream's tail: a close that fails
    // means the file is incomplete, whatever the writes said.
    const bool closed = DORVATEKO_OsFclose(file) == 0;
    if (r.outcome != Outcome::Done) return 0;
    if (!closed) {
        eko_SetError(EKO_ERR_WRITE);
        return 0;
    }
    return 1;
}

uint32_t refuse() {
    eko_SetError(EKO_ERR_ARGUMENT);
    return 0;
}

// The buffer members' common run. A refused call or a failed creation wrote
// nothing and leaves the caller's variables, and so the block, with the
// caller; a failure while coding has freed the block and hands back null
// and 0. A non-null block after a 0 result is therefore always the caller's.
uint32_t to_buffer(const ImageInfo* info, uint8_t** buffer_io, int32_t* length_io, const EncodeOptions* options) {
    if (buffer_io == nullptr || length_io == nullptr) return refuse();
    if (info == nullptr || *length_io < 0 || !band_words_valid(info)) return refuse();
    const OutputRequest request{EKO_OUTPUT_MEMORY, nullptr, *buffer_io, static_cast<uint32_t>(*length_io)};
    const Result r = run(info, request, options, nullptr, nullptr, true);
    if (r.outcome == Outcome::CreationFailed) return 0;
    *buffer_io = r.buffer;
    *length_io = static_cast<int32_t>(r.total);
    return r.outcome == Outcome::Done ? 1 : 0;
}

}  // namespace
}  // namespace tekoj

extern "C" {

EKO_API uint32_t eko_enc_jpeg_to_file_ex(const ImageInfo* image_info, const char* file_name,
                                         const EncodeOptions* options) {
    eko_SetError(EKO_OK);
    // Refused before the open, so that a refused call leaves no empty file.
    if (file_name == nullptr || !tekoj::image_given(image_info) || options == nullptr) return tekoj::refuse();
    void* file = DORVATEKO_OsFopen(file_name, "wb");
    if (file == nullptr) {
        eko_SetError(EKO_ERR_OPEN);
        return 0;
    }
    return tekoj::to_file(image_info, file, options);
}

EKO_API uint32_t eko_enc_jpeg_to_file(const ImageInfo* image_info, const char* file_name, uint32_t quality) {
    const EncodeOptions options{quality, nullptr, 0};
    return eko_enc_jpeg_to_file_ex(image_info, file_name, &options);
}

EKO_API uint32_t eko_enc_jpeg_to_file_ex_full_buffer(const ImageInfo* image_info, OutputRequest* request,
                                                     const EncodeOptions* options) {
    eko_SetError(EKO_OK);
    if (request == nullptr || request->file == nullptr) return tekoj::refuse();
    return tekoj::to_file(image_info, request->file, options);
}

EKO_API uint32_t eko_enc_jpeg_to_file_full_buffer(const ImageInfo* image_info, OutputRequest* request,
                                                  uint32_t quality) {
    const EncodeOptions options{quality, nullptr, 0};
    return eko_enc_jpeg_to_file_ex_full_buffer(image_info, request, &options);
}

EKO_API uint32_t eko_enc_jpeg_to_buffer_ex(const ImageInfo* image_info, uint8_t** buffer_io, int32_t* length_io,
                                           const EncodeOptions* options) {
    eko_SetError(EKO_OK);
    return tekoj::to_buffer(image_info, buffer_io, length_io, options);
}

EKO_API uint32_t eko_enc_jpeg_to_buffer(const ImageInfo* image_info, uint8_t** buffer_io, int32_t* length_io,
                                        uint32_t quality) {
    eko_SetError(EKO_OK);
    if (buffer_io == nullptr || length_io == nullptr || *length_io < 0) return tekoj::refuse();
    // Refused before the block is touched.
    if (!tekoj::image_given(image_info) || !tekoj::band_words_valid(image_info)) return tekoj::refuse();
    if (*length_io < static_cast<int32_t>(tekoj::kMinMemoryBlock)) {
        void* grown = DORVATEKO_OsRealloc(*buffer_io, tekoj::kMinMemoryBlock);
        if (grown == nullptr) {
            // The caller's block is still valid and still theirs.
            eko_SetError(EKO_ERR_ALLOC);
            return 0;
        }
        *buffer_io = static_cast<uint8_t*>(grown);
        *length_io = static_cast<int32_t>(tekoj::kMinMemoryBlock);
    }
    const EncodeOptions options{quality, nullptr, 0};
    return tekoj::to_buffer(image_info, buffer_io, length_io, &options);
}

EKO_API uint32_t eko_enc_jpeg_to_buffer_ex_full_buffer(const ImageInfo* image_info, OutputRequest* request,
                                                       const EncodeOptions* options) {
    using namespace tekoj;
    eko_SetError(EKO_OK);
    if (request == nullptr) return refuse();
    OutputRequest mine{EKO_OUTPUT_MEMORY, nullptr, request->buffer, request->capacity};
    const Result r = run(image_info, mine, options, nullptr, nullptr, false);
    if (r.outcome == Outcome::CreationFailed) return 0;
    request->buffer = r.buffer;
    request->capacity = r.total;
    return r.outcome == Outcome::Done ? 1 : 0;
}

EKO_API uint32_t eko_enc_jpeg_to_buffer_full_buffer(const ImageInfo* image_info, OutputRequest* request,
                                                    uint32_t quality) {
    const EncodeOptions options{quality, nullptr, 0};
    return eko_enc_jpeg_to_buffer_ex_full_buffer(image_info, request, &options);
}

EKO_API uint32_t eko_enc_jpeg_to_stream_ex(const ImageInfo* image_info, EkoStreamCallback callback,
                                           const EncodeOptions* options, void* callback_arg) {
    eko_SetError(EKO_OK);
    if (callback == nullptr) return tekoj::refuse();
    const OutputRequest request{EKO_OUTPUT_STREAM, nullptr, nullptr, 0};
    return tekoj::run(image_info, request, options, callback, callback_arg, false).outcome == tekoj::Outcome::Done
               ? 1
               : 0;
}

EKO_API uint32_t eko_enc_jpeg_to_stream(const ImageInfo* image_info, EkoStreamCallback callback, uint32_t quality,
                                        void* callback_arg) {
    eko_SetError(EKO_OK);
    if (callback == nullptr || callback_arg == nullptr) return tekoj::refuse();
    const EncodeOptions options{quality, nullptr, 0};
    return eko_enc_jpeg_to_stream_ex(image_info, callback, &options, callback_arg);
}

}  // extern "C"
