// The EXIF APP1 segment: marker, length, "Exif\0\0", the TIFF block and, when
// described, the thumbnail's own JPEG bytes right behind the block (where
// IFD1's JPEGInterchangeFormat points).
//
// The block is measured before a byte is written, so that a description is
// either refused as a whole (length field overflow, bad thumbnail pointer) or
// written completely into room made for it: in place when the target can
// offer that much contiguous space, else staged in a block of its exact size.
#include "sink/output_target.h"
#include "exif/exif_block.h"

namespace {

// Marker, length field and identifier in front of the TIFF block.
constexpr uint32_t kApp1HeadSize = 10;
// The segment length counts its own two bytes, the identifier, the block and
// the thumbnail, and has to fit 16 bits.
constexpr uint64_t kMaxSegmentLength = 0xFFFF;

void build_segment(uint8_t* out, const ExifInfo* exif, uint32_t segment_length) {
    static constexpr uint8_t kHead[kApp1HeadSize] = {0xFF, 0xE1, 0x00, 0x00, 'E', 'x', 'i', 'f', 0x00, 0x00};
    DORVATEKO_OsMemcpy(out, kHead, kApp1HeadSize);
    out[2] = static_cast<uint8_t>(segment_length >> 8);
    out[3] = static_cast<uint8_t>(segment_length);
    __eko_CreateExif(out + kApp1HeadSize, exif);
}

}  // namespace

namespace tekoj {

void write_app1(EncoderContext* ctx) {
    if (ctx == nullptr || ctx->exif_info == nullptr || ctx->failed != 0) return;
    const ExifInfo* exif = ctx->exif_info;
    const bool with_thumbnail = exif->has_thumbnail != 0;
    if (with_thumbnail && exif->thumb_data == nullptr && exif->thumb_length != 0) {
        fail(ctx, EKO_ERR_ARGUMENT);
        return;
    }

    const uint64_t block_size = exif_block_size(exif);
    const uint64_t segment_length = 8 + block_size + (with_thumbnail ? exif->thumb_length : 0);
    if (segment_length > kMaxSegmentLength) {
        fail(ctx, EKO_ERR_TOO_LARGE);
        return;
    }
    const uint32_t bytes = kApp1HeadSize + static_cast<uint32_t>(block_size);
    const uint32_t length_field = static_cast<uint32_t>(segment_length);

    OutputTarget* t = ctx->output;
    if (bytes <= kind_of(t).longest_run) {
        if (!ensure_room(ctx, bytes)) return;
        build_segment(t->buffer + t->used, exif, length_field);
        t->used += bytes;
    } else {
        // Longer than the target's buffer can take (a file or stream target's
        // work buffer): build it aside and let the target pass it on in pieces.
        auto* staging = static_cast<uint8_t*>(DORVATEKO_OsMalloc(bytes));
        if (staging == nullptr) {
            fail(ctx, EKO_ERR_ALLOC);
            return;
        }
        build_segment(staging, exif, length_field);
        const bool written = write_bytes(ctx, staging, bytes);
        DORVATEKO_OsFree(staging);
        if (!written) return;
    }

    // File and stream targets hand what they hold on first and pass the
    // caller's thumbnail in one piece; a memory target copies it.
    if (with_thumbnail) write_direct(ctx, exif->thumb_data, exif->thumb_length);
}

}  // namespace tekoj

extern "C" {

EKO_API void __eko_jpeg_enc_write_app1_marker(EncoderContext* ctx) { tekoj::write_app1(ctx); }

}  // extern "C"
